#include "operators/color/BrightnessContrast.h"

#include <algorithm>
#include <cmath>
#include <cstring>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/flow/ToolFrame.h"
#include "host/image/Half.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_BrightnessContrast("BrightnessContrast");
static ClassRegistration<BrightnessContrast, ThreadedOperator>
    s_Registration(CLSID_BrightnessContrast, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/BrightnessContrast"},
                    {RegName, "Brightness / Contrast"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "BC"},
                    {RegHelp, "Applies Brightness and Contrast"},
                    {RegIcon, "Icons.Tools.Icons.BrightnessContrast"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

using Values = BrightnessContrast::Values;

/// Settings closer than this to their neutral value count as neutral.
constexpr double kEps = 1.1920929e-07;
/// Pixels converted at a time by the rows that go through FltPixel or Pixel.
constexpr int kBlock = 256;

bool Near(double a, double b) { return std::fabs(a - b) < kEps; }

// ---- float pixels ----

/// Gamma as a true power, the sign kept apart: negative values stay negative.
struct TruePower {
    float exponent;
    float operator()(float x) const { return std::copysign(std::pow(std::fabs(x), exponent), x); }
};

/// Gamma read from the tool's table (negative values read as 0).
struct TablePower {
    const GammaTable *table;
    float operator()(float x) const { return table->LookupFlt(x); }
};

/// The whole chain on one float pixel (red, green, blue, alpha), forward or
/// reverse. Channels that are off keep their values. Written lane by lane, so
/// that the cheap steps compile to four-wide operations.
template <bool Reverse, class Pow> inline void ChainFlt(const Values &v, const Pow &pow, float p[4]) {
    const bool *on = v.chans;
    if (v.prePost) {
        const float k = std::fabs(p[3]) < static_cast<float>(kEps) ? 0.f : 1.f / p[3];
        for (int c = 0; c < 3; ++c) p[c] = on[c] ? p[c] * k : p[c];
    }
    float x[4];
    if constexpr (!Reverse) {
        for (int c = 0; c < 4; ++c) x[c] = v.gain * p[c] + v.lift;
        if (v.doGamma)
            for (int c = 0; c < 4; ++c)
                if (on[c]) x[c] = pow(x[c]);
        for (int c = 0; c < 4; ++c) p[c] = on[c] ? (x[c] - 0.5f) * v.finalContrast + 0.5f + v.bright : p[c];
        if (v.doSat) {
            const float y = 0.299f * p[0] + 0.587f * p[1] + 0.114f * p[2];
            for (int c = 0; c < 3; ++c) p[c] = on[c] ? p[c] * v.sat + y * v._sat : p[c];
        }
        if (v.useLowHigh)
            for (int c = 0; c < 4; ++c) p[c] = on[c] ? (p[c] - v.low) * v.finalScale : p[c];
    } else {
        if (v.useLowHigh)
            for (int c = 0; c < 4; ++c) p[c] = on[c] ? v.finalScale * p[c] + v.low : p[c];
        if (v.doSat) {
            const float r = p[0], g = p[1], b = p[2];
            for (int c = 0; c < 3; ++c) {
                const float *m = v.satRows[c];
                p[c] = on[c] ? m[0] * r + m[1] * g + m[2] * b : p[c];
            }
        }
        for (int c = 0; c < 4; ++c) x[c] = (p[c] - v.bright - 0.5f) * v.finalContrast + 0.5f;
        if (v.doGamma)
            for (int c = 0; c < 4; ++c)
                if (on[c]) x[c] = pow(x[c]);
        for (int c = 0; c < 4; ++c) p[c] = on[c] ? (x[c] - v.lift) * v.gain : p[c];
    }
    if (v.prePost)
        for (int c = 0; c < 3; ++c) p[c] = on[c] ? p[c] * p[3] : p[c];
    if (v.clipBlack)
        for (int c = 0; c < 4; ++c) p[c] = on[c] && p[c] < 0.f ? 0.f : p[c];
    if (v.clipWhite)
        for (int c = 0; c < 4; ++c) p[c] = on[c] && p[c] > 1.f ? 1.f : p[c];
}

/// The per-pixel function of the scalar rows: gamma from the table.
template <bool Reverse> inline FltPixel PixelFlt(const Values &v, const FltPixel &px) {
    float p[4] = {px.R, px.G, px.B, px.A};
    ChainFlt<Reverse>(v, TablePower{v.table}, p);
    return {p[0], p[1], p[2], p[3]};
}

/// RGBA float32 or float16 rows with fast powers: the four channels of a
/// pixel as one vector, read from and written to the stored row directly.
template <bool Reverse, bool Half> void VectorSpan(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    const TruePower pow{v.gamma};
    if constexpr (Half) {
        const auto *in = reinterpret_cast<const uint16_t *>(src);
        auto *out = reinterpret_cast<uint16_t *>(dst);
        for (int i = 0; i < count; ++i, in += 4, out += 4) {
            float p[4] = {HalfToFloat(in[0]), HalfToFloat(in[1]), HalfToFloat(in[2]), HalfToFloat(in[3])};
            ChainFlt<Reverse>(v, pow, p);
            for (int c = 0; c < 4; ++c) out[c] = FloatToHalf(p[c]);
        }
    } else {
        const auto *in = reinterpret_cast<const float *>(src);
        auto *out = reinterpret_cast<float *>(dst);
        for (int i = 0; i < count; ++i, in += 4, out += 4) {
            float p[4] = {in[0], in[1], in[2], in[3]};
            ChainFlt<Reverse>(v, pow, p);
            for (int c = 0; c < 4; ++c) out[c] = p[c];
        }
    }
}

/// Any float depth with fast powers (float masks, or vector rows switched
/// off): blocks of pixels converted to FltPixel, the same four-channel chain.
template <bool Reverse> void GeneralSpan(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    const TruePower pow{v.gamma};
    const int bpp = FormatOfDepth(v.depth).BytesPerPixel();
    FltPixel block[kBlock];
    for (int i = 0; i < count; i += kBlock) {
        const int n = std::min(kBlock, count - i);
        LoadFlt(v.depth, src + static_cast<size_t>(i) * bpp, n, block);
        for (int k = 0; k < n; ++k) {
            float p[4] = {block[k].R, block[k].G, block[k].B, block[k].A};
            ChainFlt<Reverse>(v, pow, p);
            block[k] = {p[0], p[1], p[2], p[3]};
        }
        StoreFlt(v.depth, block, n, dst + static_cast<size_t>(i) * bpp);
    }
}

/// Any float depth without fast powers: the per-pixel function, pixel by pixel.
template <bool Reverse> void ScalarSpan(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    const int bpp = FormatOfDepth(v.depth).BytesPerPixel();
    FltPixel block[kBlock];
    for (int i = 0; i < count; i += kBlock) {
        const int n = std::min(kBlock, count - i);
        LoadFlt(v.depth, src + static_cast<size_t>(i) * bpp, n, block);
        for (int k = 0; k < n; ++k) block[k] = PixelFlt<Reverse>(v, block[k]);
        StoreFlt(v.depth, block, n, dst + static_cast<size_t>(i) * bpp);
    }
}

// ---- 16-bit integer pixels ----

/// Whole-number bound of the intermediate 16-bit values: far beyond the
/// 0..65535 range, and small enough that products of two stay in 64 bits.
constexpr int64_t kIntBound = int64_t(1) << 31;

int64_t Bound(int64_t x) { return std::clamp(x, -kIntBound, kIntBound); }
/// Cuts a real value to a whole number (toward zero), within the bound.
int64_t Cut(double d) {
    if (std::isnan(d)) return 0;
    return static_cast<int64_t>(std::clamp(d, -static_cast<double>(kIntBound), static_cast<double>(kIntBound)));
}
int64_t Clamp16(int64_t x) { return std::clamp<int64_t>(x, 0, 65535); }
int64_t Round16(double d) { return static_cast<int64_t>(std::clamp(d, 0.0, 65535.0) + 0.5); }

/// The chain on one 16-bit pixel; 8-bit data arrives widened to 16 bits.
template <bool Reverse> void ChainInt(const Values &v, int64_t p[4]) {
    const bool *on = v.chans;
    if (v.prePost) {
        const int64_t a = p[3];
        if (a <= 0) {
            for (int c = 0; c < 3; ++c)
                if (on[c]) p[c] = 0;
            if (!on[3]) return; // nothing left that could change
        } else {
            for (int c = 0; c < 3; ++c)
                if (on[c]) p[c] = std::min<int64_t>(p[c] * 65535 / a, 65535);
        }
    }
    // x: the value after gain, lift and gamma (the order reverses backwards).
    auto contrastOf = [&v](int64_t x) { return (Bound(x - 32768) * v.contrastI) >> 14; };
    if constexpr (!Reverse) {
        for (int c = 0; c < 4; ++c) {
            if (!on[c]) continue;
            int64_t x = Clamp16(Cut(p[c] * static_cast<double>(v.gain)) + v.liftI);
            if (v.doGamma) x = v.table->Lookup(static_cast<uint16_t>(x));
            p[c] = Clamp16(contrastOf(x) + v.brightI + 32768);
        }
        if (v.doSat) {
            const double y = 0.299 * p[0] + 0.587 * p[1] + 0.114 * p[2];
            for (int c = 0; c < 3; ++c)
                if (on[c]) p[c] = Round16(p[c] * static_cast<double>(v.sat) + y * static_cast<double>(v._sat));
        }
        if (v.useLowHighI)
            for (int c = 0; c < 4; ++c)
                if (on[c]) p[c] = Clamp16(Cut((p[c] - v.lowI) * static_cast<double>(v.finalScale)));
    } else {
        if (v.useLowHighI)
            for (int c = 0; c < 4; ++c)
                if (on[c]) p[c] = Clamp16(Cut(static_cast<double>(v.finalScale) * p[c]) + v.lowI);
        if (v.doSat) {
            const double r = p[0], g = p[1], b = p[2];
            for (int c = 0; c < 3; ++c) {
                const double *m = v.satRowsD[c];
                if (on[c]) p[c] = Round16(m[0] * r + m[1] * g + m[2] * b);
            }
        }
        for (int c = 0; c < 4; ++c) {
            if (!on[c]) continue;
            int64_t x = Clamp16(contrastOf(p[c] - v.brightI) + 32768);
            if (v.doGamma) x = v.table->Lookup(static_cast<uint16_t>(x));
            p[c] = Clamp16(Cut((x - v.liftI) * static_cast<double>(v.gain)));
        }
    }
    if (v.prePost)
        for (int c = 0; c < 3; ++c)
            if (on[c]) p[c] = (p[c] * p[3] + 32767) / 65535;
}

template <bool Reverse> Pixel PixelInt(const Values &v, const Pixel &px) {
    int64_t p[4] = {px.R, px.G, px.B, px.A};
    ChainInt<Reverse>(v, p);
    return {static_cast<uint16_t>(p[0]), static_cast<uint16_t>(p[1]), static_cast<uint16_t>(p[2]),
            static_cast<uint16_t>(p[3])};
}

/// Integer depths (8 and 16 bits, RGBA and masks), through Pixel.
template <bool Reverse> void IntSpan(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    const int bpp = FormatOfDepth(v.depth).BytesPerPixel();
    Pixel block[kBlock];
    for (int i = 0; i < count; i += kBlock) {
        const int n = std::min(kBlock, count - i);
        LoadPixel(v.depth, src + static_cast<size_t>(i) * bpp, n, block);
        for (int k = 0; k < n; ++k) block[k] = PixelInt<Reverse>(v, block[k]);
        StorePixel(v.depth, block, n, dst + static_cast<size_t>(i) * bpp);
    }
}

// ---- choosing ----

/// The row function for a depth, a direction and the application's switches.
BrightnessContrast::SpanFunction ChooseSpan(int depth, bool reverse, bool fastPower, bool vectorRows) {
    if (!FormatOfDepth(depth).isFloat) return reverse ? &IntSpan<true> : &IntSpan<false>;
    if (fastPower && vectorRows && depth == DepthRGBAFlt32)
        return reverse ? &VectorSpan<true, false> : &VectorSpan<false, false>;
    if (fastPower && vectorRows && depth == DepthRGBAFlt16)
        return reverse ? &VectorSpan<true, true> : &VectorSpan<false, true>;
    if (fastPower) return reverse ? &GeneralSpan<true> : &GeneralSpan<false>;
    return reverse ? &ScalarSpan<true> : &ScalarSpan<false>;
}

/// A float colour through the chain the float rows use.
FltPixel ChainOfColor(const Values &v, bool fastPower, const FltPixel &px) {
    float p[4] = {px.R, px.G, px.B, px.A};
    if (fastPower) {
        if (v.reverse)
            ChainFlt<true>(v, TruePower{v.gamma}, p);
        else
            ChainFlt<false>(v, TruePower{v.gamma}, p);
    } else {
        if (v.reverse)
            ChainFlt<true>(v, TablePower{v.table}, p);
        else
            ChainFlt<false>(v, TablePower{v.table}, p);
    }
    return {p[0], p[1], p[2], p[3]};
}

} // namespace

BrightnessContrast::BrightnessContrast(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {});

    // The channel buttons: one row (control group 12), alpha off by default.
    struct Channel {
        const char *id, *icon;
        double on;
        Input **member;
    };
    const Channel channels[4] = {{"Red", "Controls.MultiButton.Icons.Red", 1.0, &red_},
                                 {"Green", "Controls.MultiButton.Icons.Green", 1.0, &green_},
                                 {"Blue", "Controls.MultiButton.Icons.Blue", 1.0, &blue_},
                                 {"Alpha", "Controls.MultiButton.Icons.Alpha", 0.0, &alpha_}};
    for (int c = 0; c < 4; ++c) {
        TagList button{{LinkDataType, CLSID_DataType_Number},
                       {InputControl, CLSID_InputControl_MultiButton},
                       {ControlGroup, 12},
                       {ControlMember, c},
                       {InputDefault, channels[c].on},
                       {InputMinAllowed, 0.0},
                       {InputMaxAllowed, 1.0},
                       {ButtonLook02, 1},
                       {ButtonLook04, 0},
                       {ButtonLook08, 1},
                       {ButtonLook11, 10},
                       {ButtonIcon, channels[c].icon}};
        if (c == 0) button.Set({ControlLabel, ""}); // the row itself has no caption
        *channels[c].member = AddInputTagList(channels[c].id, channels[c].id, button);
    }

    gain_ = AddInputTagList("Gain", "Gain",
                            {{LinkDataType, CLSID_DataType_Number},
                             {InputControl, CLSID_InputControl_Slider},
                             {InputDefault, 1.0},
                             {InputSliderLow, 0.0},
                             {InputSliderHigh, 5.0},
                             {SliderSteps, 101},
                             {SliderRest, 1.0}});
    lift_ = AddInputTagList("Lift", "Lift",
                            {{LinkDataType, CLSID_DataType_Number},
                             {InputControl, CLSID_InputControl_Slider},
                             {InputDefault, 0.0},
                             {InputSliderLow, -1.0},
                             {InputSliderHigh, 1.0},
                             {SliderSteps, 101},
                             {SliderRest, 0.0}});
    gamma_ = AddInputTagList("Gamma", "Gamma",
                             {{LinkDataType, CLSID_DataType_Number},
                              {InputControl, CLSID_InputControl_Slider},
                              {InputDefault, 1.0},
                              {InputMinAllowed, 0.0},
                              {InputSliderLow, 0.0},
                              {InputSliderHigh, 5.0},
                              {SliderSteps, 101},
                              {SliderRest, 1.0}});
    contrast_ = AddInputTagList("Contrast", "Contrast",
                                {{LinkDataType, CLSID_DataType_Number},
                                 {InputControl, CLSID_InputControl_Slider},
                                 {InputDefault, 0.0},
                                 {InputMinAllowed, -1.0},
                                 {InputSliderLow, -1.0},
                                 {InputSliderHigh, 1.0},
                                 {SliderSteps, 201},
                                 {SliderRest, 0.0}});
    brightness_ = AddInputTagList("Brightness", "Brightness",
                                  {{LinkDataType, CLSID_DataType_Number},
                                   {InputControl, CLSID_InputControl_Slider},
                                   {InputDefault, 0.0},
                                   {InputSliderLow, -1.0},
                                   {InputSliderHigh, 1.0},
                                   {SliderSteps, 201},
                                   {SliderRest, 0.0}});
    saturation_ = AddInputTagList("Saturation", "Saturation",
                                  {{LinkDataType, CLSID_DataType_Number},
                                   {InputControl, CLSID_InputControl_Slider},
                                   {InputDefault, 1.0},
                                   {InputMinAllowed, 0.0},
                                   {InputSliderLow, 0.0},
                                   {InputSliderHigh, 5.0},
                                   {SliderSteps, 101},
                                   {SliderRest, 1.0}});
    low_ = AddInputTagList("Low", "Low",
                           {{LinkDataType, CLSID_DataType_Number},
                            {InputControl, CLSID_InputControl_Range},
                            {ControlGroup, 1},
                            {ControlMember, 0},
                            {InputDefault, 0.0},
                            {InputMinAllowed, 0.0},
                            {InputMaxAllowed, 1.0}});
    high_ = AddInputTagList("High", "High",
                            {{LinkDataType, CLSID_DataType_Number},
                             {InputControl, CLSID_InputControl_Range},
                             {ControlGroup, 1},
                             {ControlMember, 1},
                             {InputDefault, 1.0},
                             {InputMinAllowed, 0.0},
                             {InputMaxAllowed, 1.0}});
    direction_ = AddInputTagList("Direction", "Direction",
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_MultiButton},
                                  {InputDefault, 0.0},
                                  {ButtonsFillRow, 1},
                                  {ListAddItem, "Forward"},
                                  {ListAddItem, "Reverse"}});
    clipBlack_ = AddInputTagList("Clip Black", "ClipBlack",
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_Checkbox},
                                  {InputDefault, 0.0},
                                  {InputMinAllowed, 0.0},
                                  {InputMaxAllowed, 1.0},
                                  {ControlRowLabel, "Clip"},
                                  {ControlLabel, "Black"},
                                  {ControlWidth, 0.5}});
    clipWhite_ = AddInputTagList("Clip White", "ClipWhite",
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_Checkbox},
                                  {InputDefault, 0.0},
                                  {InputMinAllowed, 0.0},
                                  {InputMaxAllowed, 1.0},
                                  {ControlLabel, "White"},
                                  {ControlWidth, 0.5}});
    prePost_ = AddInputTagList("Pre-Divide / Post-Multiply", "PreDividePostMultiply",
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Checkbox},
                                {InputDefault, 0.0},
                                {InputMinAllowed, 0.0},
                                {InputMaxAllowed, 1.0}});

    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

BrightnessContrast::~BrightnessContrast() = default;

void BrightnessContrast::ReadValues(Request *req) {
    Values v;
    v.reverse = req->GetInputNumber(direction_) >= 0.5;
    const Input *chanInputs[4] = {red_, green_, blue_, alpha_};
    for (int c = 0; c < 4; ++c) v.chans[c] = req->GetInputNumber(chanInputs[c]) >= 0.5;
    const double gain = req->GetInputNumber(gain_), lift = req->GetInputNumber(lift_),
                 gamma = req->GetInputNumber(gamma_);
    const double contrast = req->GetInputNumber(contrast_), bright = req->GetInputNumber(brightness_);
    const double sat = req->GetInputNumber(saturation_), low = req->GetInputNumber(low_),
                 high = req->GetInputNumber(high_);

    v.doGain = !Near(gain, 1.0) || !Near(lift, 0.0);
    v.doGamma = !Near(gamma, 1.0);
    v.doSat = !Near(1.0 - sat, 0.0);
    v.sat = static_cast<float>(sat);
    v._sat = static_cast<float>(1.0 - sat);
    v.doBright = !Near(bright, 0.0);
    v.contrast = static_cast<float>(contrast + 1.0);
    v.doContrast = !Near(v.contrast, 1.0);
    v.useLowHigh = !Near(low, 0.0) || !Near(high, 1.0);
    v.range = static_cast<float>(high - low);
    v.inverseRange = v.range >= kEps ? 1.f / v.range : 0.f;

    const double gainDiff = gain - lift;
    const double invGamma = gamma < 1e-05 ? 100000.0 : 1.0 / gamma;
    if (!v.reverse) {
        v.gain = static_cast<float>(gainDiff);
        v.gamma = static_cast<float>(invGamma);
        v.finalContrast = v.contrast;
        v.finalScale = v.inverseRange;
    } else {
        v.gain = gainDiff == 0.0 ? 1.f : static_cast<float>(1.0 / gainDiff);
        v.gamma = static_cast<float>(gamma);
        v.finalContrast = v.contrast == 0.f ? 1.f : 1.f / v.contrast;
        v.finalScale = v.range;
    }
    v.clipBlack = req->GetInputNumber(clipBlack_) >= 0.5;
    v.clipWhite = req->GetInputNumber(clipWhite_) >= 0.5;
    v.prePost = req->GetInputNumber(prePost_) >= 0.5;
    v.lift = static_cast<float>(lift);
    v.bright = static_cast<float>(bright);
    v.low = static_cast<float>(low);
    v.high = static_cast<float>(high);

    // Saturation: to luma and chroma, chroma scaled, back to RGB. Channels
    // that are off keep their identity rows.
    ColorMatrixFull toLumaChroma, back;
    const double fwd[3][3] = {{0.299, 0.587, 0.114}, {-0.16873589, -0.33126414, 0.5}, {0.5, -0.4186876, -0.08131241}};
    const double bwd[3][3] = {{1.0, 0.0, 1.402}, {1.0, -0.34413627, -0.71413624}, {1.0, 1.772, 0.0}};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) toLumaChroma.m[i][j] = fwd[i][j], back.m[i][j] = bwd[i][j];
    satMat_.SetIdentity();
    satMat_.Then(toLumaChroma).Scale(1, sat).Scale(2, sat).Then(back);
    for (int c = 0; c < 3; ++c)
        if (!v.chans[c])
            for (int j = 0; j < 5; ++j) satMat_.m[c][j] = c == j ? 1.0 : 0.0;
    if (v.reverse && !satMat_.Invert(kEps)) {
        satMat_.SetIdentity();
        v.doSat = false;
    }
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) {
            v.satRowsD[i][j] = satMat_.m[i][j];
            v.satRows[i][j] = static_cast<float>(satMat_.m[i][j]);
        }

    v.liftI = Cut(static_cast<double>(v.lift) * 65535.0);
    v.lowI = Cut(static_cast<double>(v.low) * 65535.0);
    v.highI = Cut(static_cast<double>(v.high) * 65535.0);
    v.brightI = Cut(static_cast<double>(v.bright) * 65535.0);
    v.contrastI = Cut(static_cast<double>(v.finalContrast) * 16384.0);
    v.useLowHighI = v.lowI != 0 || v.highI != 0xffff;
    v.table = &gammaTable_;
    v_ = v;
}

ColorMatrixFull BrightnessContrast::ChainMatrix() const {
    const Values &v = v_;
    ColorMatrixFull m;
    auto each = [&v](auto &&step) {
        for (int c = 0; c < 4; ++c)
            if (v.chans[c]) step(c);
    };
    if (!v.reverse) {
        if (v.doGain) each([&](int c) { m.Scale(c, v.gain).Offset(c, v.lift); });
        if (v.doContrast) each([&](int c) { m.Offset(c, -0.5).Scale(c, v.finalContrast).Offset(c, 0.5); });
        if (v.doBright) each([&](int c) { m.Offset(c, v.bright); });
        if (v.doSat) m.Then(satMat_);
        if (v.useLowHigh) each([&](int c) { m.Offset(c, -v.low).Scale(c, v.finalScale); });
    } else {
        if (v.useLowHigh) each([&](int c) { m.Scale(c, v.finalScale).Offset(c, v.low); });
        if (v.doSat) m.Then(satMat_);
        if (v.doBright) each([&](int c) { m.Offset(c, -v.bright); });
        if (v.doContrast) each([&](int c) { m.Offset(c, -0.5).Scale(c, v.finalContrast).Offset(c, 0.5); });
        if (v.doGain) each([&](int c) { m.Offset(c, -v.lift).Scale(c, v.gain); });
    }
    return m;
}

bool BrightnessContrast::RunDevice(Request *, const Image *, Image *) {
    return false; // no device route in this build: the rows do the work
}

void BrightnessContrast::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) { // a required main input: the engine does not get here without one
        req->SetOutputData(output_, nullptr);
        return;
    }
    ReadValues(req);
    const Values &v = v_;
    const bool isFloat = src->IsFloat();

    // 1. Nothing to do: hand the input on.
    const bool anyChannel = v.chans[0] || v.chans[1] || v.chans[2] || v.chans[3];
    bool work = v.prePost || v.doGain || v.doGamma || v.doSat;
    if (isFloat)
        work = work || v.doBright || v.doContrast || v.useLowHigh || v.clipBlack || v.clipWhite;
    else // integer values cannot leave 0..65535, so clipping changes nothing
        work = work || v.brightI != 0 || v.contrastI != 0x4000 || v.lowI != 0 || v.highI != 0xffff;
    if (!anyChannel || !work) {
        req->SetOutputData(output_, src);
        return;
    }

    // 2. The output image.
    const bool precalc = req->IsPreCalc();
    const OvID clipping = GetClippingMode(req);
    const AutoImageRoI roi(req);
    const ImgRectI dataWindow = OutputDataWindow(req, input_, src, clipping);
    const ImgRectI validWindow = roi ? roi->rect : dataWindow;
    Ref<Image> dst = NewImageTagList({{ImgLikeImage, src},
                                      {ImgDataWindow, &dataWindow},
                                      {ImgValidWindow, &validWindow},
                                      {ImgNoData, precalc},
                                      {ImgForRequest, 1},
                                      {ImgTakeWindows, 1}});
    auto outOfMemory = [&] {
        Fail(req, "%s: out of memory (time = %f)\n", Name().c_str(), req->Time());
        req->SetOutputData(output_, nullptr);
    };
    if (!dst) return outOfMemory();

    if (!v.prePost && !v.doGamma && (!(v.clipBlack || v.clipWhite) || !isFloat)) {
        // 3. A linear chain: one matrix, applied by the host.
        const ColorMatrixFull full = ChainMatrix();
        const ColorMatrix cut(full);
        TagList tags{{WorkOperator, this},
                     {WorkThreaded, 1},
                     {WorkUseGPU, !precalc && IsGPUEnabled(req, false)},
                     {WorkRequest, req}};
        if (v.chans[3])
            tags.Set({MtxColorMatrixFull, &full});
        else
            tags.Set({MtxColorMatrix, &cut});
        if (!ApplyMatrixTagList(src, dst.Get(), tags)) return outOfMemory();
    } else {
        // 4. Rows. The pixel type and row function are chosen once here.
        const bool fastPower = GetApp()->GetAttrB(AppFastPower);
        const bool vectorRows = GetApp()->GetAttrB(AppVectorRows);
        v_.depth = src->Depth();
        if (v.doGamma) {
            if (!isFloat && tableIntExponent_ != v.gamma) {
                gammaTable_.InitTable(req, v.gamma);
                tableIntExponent_ = v.gamma;
            } else if (isFloat && !fastPower && tableFltExponent_ != v.gamma) {
                gammaTable_.InitTableFlt(req, 1.0, v.gamma);
                tableFltExponent_ = v.gamma;
            }
        }
        span_ = ChooseSpan(v.depth, v.reverse, fastPower, vectorRows);
        bytesPerPixel_ = src->BytesPerPixel();

        // The canvas colour through the same function, also stored in the
        // output's depth for the spans beyond the input's window.
        if (isFloat) {
            const FltPixel canvas = ChainOfColor(v, fastPower, src->GetCanvasColor());
            dst->SetCanvasColor(canvas);
            StoreFlt(v.depth, &canvas, 1, canvasPixel_);
        } else {
            Pixel canvas;
            src->GetCanvasColor(canvas);
            canvas = v.reverse ? PixelInt<true>(v, canvas) : PixelInt<false>(v, canvas);
            dst->SetCanvasColor(canvas);
            StorePixel(v.depth, &canvas, 1, canvasPixel_);
        }

        const bool rowsWanted = !precalc && !dst->ValidWindow().IsNull();
        const bool onDevice = rowsWanted && IsGPUEnabled(req, true) && RunDevice(req, src, dst.Get());
        if (rowsWanted && !onDevice) {
            if (!dst->AllocScanLineData()) return outOfMemory();
            src_ = src;
            dst_ = dst.Get();
            inWindow_ = src->HasScanLineData() ? src->DataWindow() : ImgRectI();
            outWindow_ = dataWindow;
            DoMultiProcess(req, dataWindow.Height());
            src_ = nullptr;
            dst_ = nullptr;
        }
    }

    // 5. With clipping, what lies beyond the window keeps the input's canvas.
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
    req->SetOutputData(output_, dst.Get());
}

void BrightnessContrast::ProcessChunk(Request *, int chunk) {
    if (dst_->CheckAbort()) return;
    const int y = outWindow_.y0 + chunk;
    uint8_t *row = dst_->ScanLine(y);
    if (!row) return;
    const int bpp = bytesPerPixel_;
    auto fillCanvas = [this, bpp](uint8_t *at, int count) {
        for (int i = 0; i < count; ++i) std::memcpy(at + static_cast<size_t>(i) * bpp, canvasPixel_, bpp);
    };
    const RowSpans s = SplitRow(outWindow_, inWindow_, y);
    fillCanvas(row, s.midStart - s.x0);
    if (s.hasInput)
        span_(v_, src_->PixelAddress(s.midStart, y), row + static_cast<size_t>(s.midStart - s.x0) * bpp,
              s.midEnd - s.midStart);
    fillCanvas(row + static_cast<size_t>(s.midEnd - s.x0) * bpp, s.x1 - s.midEnd);
}

} // namespace Orvane
