#include "operators/color/WhiteBalance.h"

#include <cmath>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "operators/color/ColorGain.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_WhiteBalance("WhiteBalance");
static ClassRegistration<WhiteBalance, ThreadedOperator>
    s_Registration(CLSID_WhiteBalance, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/WhiteBalance"},
                    {RegName, "White Balance"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "WB"},
                    {RegHelp, "Neutralises a color cast by a chosen gray"},
                    {RegIcon, "Icons.Tools.Icons.WhiteBalance"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

constexpr double kEps = 1.1920929e-07;

/// Linear Rec. 709 RGB to CIE XYZ (D65 white).
constexpr double kRGBToXYZ[3][3] = {
    {0.4124564, 0.3575761, 0.1804375}, {0.2126729, 0.7151522, 0.0721750}, {0.0193339, 0.1191920, 0.9503041}};
/// CIE XYZ to the Bradford cone response.
constexpr double kBradford[3][3] = {{0.8951, 0.2664, -0.1614}, {-0.7502, 1.7135, 0.0367}, {0.0389, -0.0685, 1.0296}};

ColorMatrixFull Matrix3(const double m[3][3]) {
    ColorMatrixFull full;
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) full.m[i][j] = m[i][j];
    return full;
}

/// RGB to the space where the channels are scaled: RGB itself, or the cone response.
ColorMatrixFull ToScalingSpace(bool cones) {
    ColorMatrixFull m;
    if (cones) m.Then(Matrix3(kRGBToXYZ)).Then(Matrix3(kBradford));
    return m;
}

/// CIE 1931 xy to CIE 1960 uv and back.
void XYToUV(double x, double y, double &u, double &v) {
    const double d = -2 * x + 12 * y + 3;
    u = 4 * x / d, v = 6 * y / d;
}
void UVToXY(double u, double v, double &x, double &y) {
    const double d = 2 * u - 8 * v + 4;
    x = 3 * u / d, y = 2 * v / d;
}

/// The Planckian locus in xy by the published cubic spline approximation
/// (x as a cubic in 1000 / T over two spans, y as a cubic in x over three),
/// good to about 1e-3 from 1667 K to 25000 K.
void PlanckXY(double t, double &x, double &y) {
    const double t1 = 1e3 / t, t2 = t1 * t1, t3 = t2 * t1;
    x = t <= 4000 ? -0.2661239 * t3 - 0.2343589 * t2 + 0.8776956 * t1 + 0.179910
                  : -3.0258469 * t3 + 2.1070379 * t2 + 0.2226347 * t1 + 0.240390;
    const double x2 = x * x, x3 = x2 * x;
    if (t <= 2222)
        y = -1.1063814 * x3 - 1.34811020 * x2 + 2.18555832 * x - 0.20219683;
    else if (t <= 4000)
        y = -0.9549476 * x3 - 1.37418593 * x2 + 2.09137015 * x - 0.16748867;
    else
        y = 3.0817580 * x3 - 5.87338670 * x2 + 3.75112997 * x - 0.37001483;
}

void Times(const ColorMatrixFull &m, const double in[3], double out[3]) {
    for (int i = 0; i < 3; ++i) out[i] = m.m[i][0] * in[0] + m.m[i][1] * in[1] + m.m[i][2] * in[2];
}

/// The linear RGB of the white at xy, luminance 1.
void WhiteRGB(double x, double y, double rgb[3]) {
    ColorMatrixFull toRGB = Matrix3(kRGBToXYZ);
    toRGB.Invert();
    const double xyz[3] = {x / y, 1.0, (1 - x - y) / y};
    Times(toRGB, xyz, rgb);
}

} // namespace

void WhiteBalance::TemperatureWhite(double kelvin, double tint, double &x, double &y) {
    double u, v, ua, va, ub, vb, xa, ya, xb, yb;
    PlanckXY(kelvin, x, y);
    XYToUV(x, y, u, v);
    // The locus's direction from its neighbours one kelvin away; the normal
    // that points to larger v is the green side.
    PlanckXY(kelvin - 1, xa, ya);
    PlanckXY(kelvin + 1, xb, yb);
    XYToUV(xa, ya, ua, va);
    XYToUV(xb, yb, ub, vb);
    double nu = -(vb - va), nv = ub - ua;
    if (nv < 0) nu = -nu, nv = -nv;
    const double len = std::hypot(nu, nv);
    UVToXY(u + tint * 1e-3 * nu / len, v + tint * 1e-3 * nv / len, x, y);
}

WhiteBalance::WhiteBalance(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {});
    method_ = AddInputTagList("Method", "Method",
                              {{LinkDataType, CLSID_DataType_Number},
                               {InputControl, CLSID_InputControl_MultiButton},
                               {InputDefault, 0.0},
                               {InputNotify, 1},
                               {ButtonsFillRow, 1},
                               {ListAddItem, "Picked Color"},
                               {ListAddItem, "Temperature"}});
    space_ = AddInputTagList("Space", "Space",
                             {{LinkDataType, CLSID_DataType_Number},
                              {InputControl, CLSID_InputControl_MultiButton},
                              {InputDefault, 1.0},
                              {ButtonsFillRow, 1},
                              {ListAddItem, "RGB"},
                              {ListAddItem, "Cone Response"}});
    static const char *const kChannels[3] = {"Red", "Green", "Blue"};
    for (int c = 0; c < 3; ++c) {
        TagList t{{LinkDataType, CLSID_DataType_Number},
                  {InputControl, CLSID_InputControl_Color},
                  {ControlGroup, 1},
                  {ControlMember, c},
                  {ColorChannel, 6 + c},
                  {InputSliderLow, 0.0},
                  {InputSliderHigh, 1.0},
                  {InputDefault, 0.5}};
        if (c == 0) t.Add({ControlLabel, "Neutral Color"});
        const std::string name = std::string("Neutral ") + kChannels[c], id = std::string("Neutral") + kChannels[c];
        neutral_[c] = AddInputTagList(name.c_str(), id.c_str(), t);
    }
    auto kelvin = [this](const char *name, const char *id) {
        return AddInputTagList(name, id,
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Slider},
                                {InputDefault, 6500.0},
                                {InputMinAllowed, 1667.0},
                                {InputMaxAllowed, 25000.0},
                                {InputSliderLow, 2000.0},
                                {InputSliderHigh, 12000.0},
                                {SliderSteps, 101}});
    };
    auto tint = [this](const char *name, const char *id) {
        return AddInputTagList(name, id,
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Slider},
                                {InputDefault, 0.0},
                                {InputMinAllowed, -50.0},
                                {InputMaxAllowed, 50.0},
                                {InputSliderLow, -20.0},
                                {InputSliderHigh, 20.0},
                                {SliderSteps, 81}});
    };
    temperature_ = kelvin("Temperature", "Temperature");
    tint_ = tint("Tint", "Tint");
    targetTemperature_ = kelvin("Target Temperature", "TargetTemperature");
    targetTint_ = tint("Target Tint", "TargetTint");
    direction_ = AddInputTagList("Direction", "Direction",
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_MultiButton},
                                  {InputDefault, 0.0},
                                  {ButtonsFillRow, 1},
                                  {ListAddItem, "Forward"},
                                  {ListAddItem, "Reverse"}});
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

WhiteBalance::~WhiteBalance() = default;

void WhiteBalance::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    // Only the controls of the chosen method are shown.
    if (const auto *n = dynamic_cast<const Number *>(param); n && in == method_) {
        const bool picked = std::lround(n->value) == 0;
        for (Input *i : neutral_) i->SetAttrsTagList({{ControlVisible, picked}});
        for (Input *i : {temperature_, tint_, targetTemperature_, targetTint_})
            i->SetAttrsTagList({{ControlVisible, !picked}});
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void WhiteBalance::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const bool cones = std::lround(req->GetInputNumber(space_)) == 1;
    const ColorMatrixFull toSpace = ToScalingSpace(cones);
    // The white to remove and the white it becomes, as RGB.
    double from[3], to[3];
    const bool picked = std::lround(req->GetInputNumber(method_)) == 0;
    if (picked) {
        for (int c = 0; c < 3; ++c) from[c] = req->GetInputNumber(neutral_[c]);
        const double y = 0.2126 * from[0] + 0.7152 * from[1] + 0.0722 * from[2];
        to[0] = to[1] = to[2] = y;
    } else {
        double x, y;
        TemperatureWhite(req->GetInputNumber(temperature_), req->GetInputNumber(tint_), x, y);
        WhiteRGB(x, y, from);
        TemperatureWhite(req->GetInputNumber(targetTemperature_), req->GetInputNumber(targetTint_), x, y);
        WhiteRGB(x, y, to);
    }
    // The channel scales in the chosen space.
    double fromS[3], toS[3], scale[3];
    Times(toSpace, from, fromS);
    Times(toSpace, to, toS);
    bool neutral = true;
    for (int c = 0; c < 3; ++c) {
        if (!(fromS[c] > kEps) || !(toS[c] > kEps)) {
            // A picked colour with a channel at 0, or a temperature white outside the RGB primaries.
            const double *bad = fromS[c] > kEps ? to : from;
            Fail(req, "%s: the %s (%g, %g, %g) cannot be balanced: it has no %s\n", Name().c_str(),
                 picked        ? "neutral color"
                 : bad == from ? "temperature's white"
                               : "target's white",
                 bad[0], bad[1], bad[2], cones ? "positive cone response" : "positive red, green and blue");
            req->SetOutputData(output_, nullptr);
            return;
        }
        scale[c] = toS[c] / fromS[c];
        neutral = neutral && std::fabs(scale[c] - 1.0) < kEps;
    }
    if (neutral) {
        req->SetOutputData(output_, src);
        return;
    }
    ColorMatrixFull m = toSpace, back = toSpace;
    back.Invert();
    for (int c = 0; c < 3; ++c) m.Scale(c, scale[c]);
    m.Then(back);
    if (req->GetInputNumber(direction_) >= 0.5) m.Invert();
    Ref<Image> dst = RunGainMatrix(*this, req, input_, src, m);
    if (!dst) FailOutOfMemory(req);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
