#include "operators/color/GamutConvert.h"

#include <cmath>
#include <cstdio>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Parameter.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_GamutConvert("GamutConvert");
static ClassRegistration<GamutConvert, ThreadedOperator>
    s_Registration(CLSID_GamutConvert, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/GamutConvert"},
                    {RegName, "Gamut"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "GMT"},
                    {RegHelp, "Converts between color gamuts and transfer curves"},
                    {RegIcon, "Icons.Tools.Icons.GamutConvert"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

using Mat3 = double[3][3];

/// Chromaticities x, y of red, green, blue and white.
struct Primaries {
    double xy[4][2];
};

const Primaries &PrimariesOf(GamutConvert::Gamut g) {
    static const Primaries table[] = {
        {{{0.640, 0.330}, {0.300, 0.600}, {0.150, 0.060}, {0.3127, 0.3290}}},    // Rec.709 / sRGB, D65
        {{{0.708, 0.292}, {0.170, 0.797}, {0.131, 0.046}, {0.3127, 0.3290}}},    // Rec.2020, D65
        {{{0.680, 0.320}, {0.265, 0.690}, {0.150, 0.060}, {0.314, 0.351}}},      // DCI-P3, DCI white
        {{{0.680, 0.320}, {0.265, 0.690}, {0.150, 0.060}, {0.3127, 0.3290}}},    // Display P3, D65
        {{{0.7347, 0.2653}, {0.0, 1.0}, {0.0001, -0.0770}, {0.32168, 0.33767}}}, // ACES AP0, ACES white
        {{{0.713, 0.293}, {0.165, 0.830}, {0.128, 0.044}, {0.32168, 0.33767}}},  // ACES AP1, ACES white
    };
    return table[g];
}

void Multiply(const Mat3 a, const Mat3 b, Mat3 out) {
    Mat3 r = {};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j)
            for (int k = 0; k < 3; ++k) r[i][j] += a[i][k] * b[k][j];
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) out[i][j] = r[i][j];
}

void Invert(const Mat3 m, Mat3 out) {
    const double det = m[0][0] * (m[1][1] * m[2][2] - m[1][2] * m[2][1]) -
                       m[0][1] * (m[1][0] * m[2][2] - m[1][2] * m[2][0]) +
                       m[0][2] * (m[1][0] * m[2][1] - m[1][1] * m[2][0]);
    Mat3 r;
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) {
            // Cofactor of m[j][i] over the determinant.
            const int r0 = (j + 1) % 3, r1 = (j + 2) % 3, c0 = (i + 1) % 3, c1 = (i + 2) % 3;
            r[i][j] = (m[r0][c0] * m[r1][c1] - m[r0][c1] * m[r1][c0]) / det;
        }
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) out[i][j] = r[i][j];
}

/// XYZ of a chromaticity at luminance 1.
void XYZOf(const double xy[2], double out[3]) {
    out[0] = xy[0] / xy[1];
    out[1] = 1.0;
    out[2] = (1.0 - xy[0] - xy[1]) / xy[1];
}

/// Linear RGB of the primaries to XYZ, white at luminance 1.
void RGBToXYZ(const Primaries &p, Mat3 out) {
    Mat3 cols;
    for (int c = 0; c < 3; ++c) {
        double xyz[3];
        XYZOf(p.xy[c], xyz);
        for (int r = 0; r < 3; ++r) cols[r][c] = xyz[r];
    }
    Mat3 inv;
    Invert(cols, inv);
    double white[3], scale[3] = {};
    XYZOf(p.xy[3], white);
    for (int r = 0; r < 3; ++r)
        for (int k = 0; k < 3; ++k) scale[r] += inv[r][k] * white[k];
    for (int r = 0; r < 3; ++r)
        for (int c = 0; c < 3; ++c) out[r][c] = cols[r][c] * scale[c];
}

/// XYZ under white `from` to XYZ under white `to`, by the Bradford cone response.
void Bradford(const double from[2], const double to[2], Mat3 out) {
    const Mat3 cone = {{0.8951, 0.2664, -0.1614}, {-0.7502, 1.7135, 0.0367}, {0.0389, -0.0685, 1.0296}};
    double ws[3], wd[3], cs[3] = {}, cd[3] = {};
    XYZOf(from, ws);
    XYZOf(to, wd);
    for (int r = 0; r < 3; ++r)
        for (int k = 0; k < 3; ++k) cs[r] += cone[r][k] * ws[k], cd[r] += cone[r][k] * wd[k];
    Mat3 scale = {{cd[0] / cs[0], 0, 0}, {0, cd[1] / cs[1], 0}, {0, 0, cd[2] / cs[2]}}, inv;
    Invert(cone, inv);
    Multiply(scale, cone, out);
    Multiply(inv, out, out);
}

std::string Num(double v) {
    char text[32];
    std::snprintf(text, sizeof text, "%.17g", v);
    return text;
}

/// The transform that takes curve values to linear (`decode`) or back, as
/// the text of one transform; "" for linear.
std::string CurveText(GamutConvert::Curve curve, double gamma, bool decode) {
    const std::string inverse = decode ? "" : ", direction: inverse";
    switch (curve) {
    case GamutConvert::SRGB: return "!<ExponentWithLinearTransform> {gamma: 2.4, offset: 0.055" + inverse + "}";
    case GamutConvert::Rec709Curve:
        return "!<ExponentWithLinearTransform> {gamma: " + Num(1 / 0.45) + ", offset: 0.099" + inverse + "}";
    case GamutConvert::Gamma: return "!<ExponentTransform> {value: " + Num(gamma) + inverse + "}";
    case GamutConvert::CineonLog:
        // Linear to log is the forward direction of the log transform.
        return "!<LogAffineTransform> {base: 10, log_side_slope: " + Num(300.0 / 1023.0) +
               ", log_side_offset: " + Num(685.0 / 1023.0) +
               ", lin_side_slope: " + Num(1 - std::pow(10.0, -590.0 / 300.0)) +
               ", lin_side_offset: " + Num(std::pow(10.0, -590.0 / 300.0)) + (decode ? ", direction: inverse" : "") +
               "}";
    case GamutConvert::Linear: break;
    }
    return {};
}

TagList ChoiceList(std::initializer_list<const char *> items, double max) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_Combo},
                 {InputInteger, 1},
                 {InputMinAllowed, 0.0},
                 {InputMaxAllowed, max},
                 {InputDefault, 0.0},
                 {InputNotify, 1}};
    for (const char *item : items) tags.Add({ListAddItem, item});
    return tags;
}

} // namespace

void GamutConvert::GamutMatrix(Gamut from, Gamut to, double m[3][3]) {
    const Primaries &src = PrimariesOf(from), &dst = PrimariesOf(to);
    Mat3 toXYZ, adapt, fromXYZ;
    RGBToXYZ(src, toXYZ);
    Bradford(src.xy[3], dst.xy[3], adapt);
    RGBToXYZ(dst, fromXYZ);
    Invert(fromXYZ, fromXYZ);
    Multiply(adapt, toXYZ, m);
    Multiply(fromXYZ, m, m);
}

GamutConvert::GamutConvert(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ColorProcessorTool(reg, args, tags) {
    const auto gamuts = {"Rec.709 / sRGB", "Rec.2020", "DCI-P3", "Display P3", "ACES AP0", "ACES AP1"};
    const auto curves = {"Linear", "sRGB", "Rec.709", "Gamma", "Cineon Log"};
    const TagList gamma{{LinkDataType, CLSID_DataType_Number},
                        {InputControl, CLSID_InputControl_Slider},
                        {InputDefault, 2.2},
                        {InputSliderLow, 0.2},
                        {InputSliderHigh, 4.0},
                        {InputMinAllowed, 0.01},
                        {InputMaxAllowed, 10.0},
                        {ControlVisible, 0}};
    sourceGamut_ = AddInputTagList("Source Gamut", "SourceGamut", ChoiceList(gamuts, 5));
    sourceCurve_ = AddInputTagList("Source Curve", "SourceCurve", ChoiceList(curves, 4));
    sourceGamma_ = AddInputTagList("Source Gamma", "SourceGamma", gamma);
    outputGamut_ = AddInputTagList("Output Gamut", "OutputGamut", ChoiceList(gamuts, 5));
    outputCurve_ = AddInputTagList("Output Curve", "OutputCurve", ChoiceList(curves, 4));
    outputGamma_ = AddInputTagList("Output Gamma", "OutputGamma", gamma);
    AddImageLinks();
}

void GamutConvert::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    auto *number = dynamic_cast<Number *>(param);
    if (number && (in == sourceCurve_ || in == outputCurve_)) {
        Input *gamma = in == sourceCurve_ ? sourceGamma_ : outputGamma_;
        gamma->SetAttrsTagList({{ControlVisible, std::lround(number->value) == Gamma ? 1 : 0}});
    }
    ColorProcessorTool::NotifyChanged(in, param, time, tags);
}

ColorProcessorPtr GamutConvert::ProcessorFor(Request *req, bool *passThrough, std::string *error) {
    const auto srcGamut = static_cast<Gamut>(std::lround(req->GetInputNumber(sourceGamut_)));
    const auto dstGamut = static_cast<Gamut>(std::lround(req->GetInputNumber(outputGamut_)));
    const auto srcCurve = static_cast<Curve>(std::lround(req->GetInputNumber(sourceCurve_)));
    const auto dstCurve = static_cast<Curve>(std::lround(req->GetInputNumber(outputCurve_)));
    const double srcGamma = req->GetInputNumber(sourceGamma_), dstGamma = req->GetInputNumber(outputGamma_);
    std::vector<std::string> steps;
    if (const std::string t = CurveText(srcCurve, srcGamma, true); !t.empty()) steps.push_back(t);
    if (srcGamut != dstGamut) {
        Mat3 m;
        GamutMatrix(srcGamut, dstGamut, m);
        std::string t = "!<MatrixTransform> {matrix: [";
        for (int r = 0; r < 4; ++r)
            for (int c = 0; c < 4; ++c)
                t += Num(r < 3 && c < 3 ? m[r][c] : r == c ? 1.0 : 0.0) + (r == 3 && c == 3 ? "]}" : ", ");
        steps.push_back(t);
    }
    if (const std::string t = CurveText(dstCurve, dstGamma, false); !t.empty()) steps.push_back(t);
    if (steps.empty()) {
        *passThrough = true;
        return nullptr;
    }
    std::string text = "!<GroupTransform> {children: [";
    for (size_t i = 0; i < steps.size(); ++i) text += (i ? ", " : "") + steps[i];
    text += "]}";
    return Kept(
        text, [&](std::string *err) { return ColorConfig::DescribedProcessor(text, err); }, error);
}

} // namespace Orvane
