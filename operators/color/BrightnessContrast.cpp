#include "operators/color/BrightnessContrast.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstddef>
#include <cstring>
#include <memory>

#include "host/app/Application.h"
#include "host/color/FastPow.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/image/Half.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/PointKernel.h"
#include "host/krom/kernels/ColorKernelParams.h"
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
/// Pixels converted at a time by the integer rows.
constexpr int kBlock = 256;

bool Near(double a, double b) { return std::fabs(a - b) < kEps; }

// ---- float pixels ----

/// Gamma as a true power, the sign kept apart: negative values stay negative.
/// Applied to one channel's values of a block, in place.
struct TruePower {
    float exponent;
    void operator()(float *x, int n) const { PowAbsSigned(x, exponent, x, n); }
};

/// Gamma read from the tool's table (negative values read as 0).
struct TablePower {
    const GammaTable *table;
    void operator()(float *x, int n) const {
        for (int k = 0; k < n; ++k) x[k] = table->LookupFlt(x[k]);
    }
};

/// The channels that are on as bit masks (all ones or zero), so that the steps
/// below choose between new and old values with bit operations: no branches
/// per channel, and four-wide code.
struct OnMask {
    uint32_t bits[4];
    explicit OnMask(const bool on[4]) {
        for (int c = 0; c < 4; ++c) bits[c] = on[c] ? ~0u : 0u;
    }
    /// `changed` where channel c is on, `old` where it is off.
    float Pick(int c, float changed, float old) const {
        return std::bit_cast<float>((std::bit_cast<uint32_t>(changed) & bits[c]) |
                                    (std::bit_cast<uint32_t>(old) & ~bits[c]));
    }
};

/// Pixels the float rows take at a time.
constexpr int kFltBlock = 256;

/// The steps of the chain before the gamma, on n float pixels (red, green,
/// blue, alpha): the pre-divide, then forward gain and lift, or reverse
/// low/high, saturation, brightness and contrast. Leaves in x the values the
/// gamma takes; channels that are off keep their values in p. Step by step
/// over all n pixels, each step's switch tested once, and written lane by
/// lane, so that the steps compile to four-wide operations without branches.
template <bool Reverse> inline void ChainFltBefore(const Values &v, const OnMask &on, float (*__restrict p)[4],
                                                   float (*__restrict x)[4], int n) {
    if (v.prePost)
        for (int k = 0; k < n; ++k) {
            const float a = std::fabs(p[k][3]) < static_cast<float>(kEps) ? 0.f : 1.f / p[k][3];
            for (int c = 0; c < 3; ++c) p[k][c] = on.Pick(c, p[k][c] * a, p[k][c]);
        }
    if constexpr (!Reverse) {
        const float gain = v.gain, lift = v.lift;
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) x[k][c] = gain * p[k][c] + lift;
    } else {
        if (v.useLowHigh) {
            const float scale = v.finalScale, low = v.low;
            for (int k = 0; k < n; ++k)
                for (int c = 0; c < 4; ++c) p[k][c] = on.Pick(c, scale * p[k][c] + low, p[k][c]);
        }
        if (v.doSat) {
            float m[3][3];
            std::memcpy(m, v.satRows, sizeof m);
            for (int k = 0; k < n; ++k) {
                const float r = p[k][0], g = p[k][1], b = p[k][2];
                for (int c = 0; c < 3; ++c) p[k][c] = on.Pick(c, m[c][0] * r + m[c][1] * g + m[c][2] * b, p[k][c]);
            }
        }
        const float bright = v.bright, contrast = v.finalContrast;
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) x[k][c] = (p[k][c] - bright - 0.5f) * contrast + 0.5f;
    }
}

/// The steps after the gamma: x holds the gamma's results for the channels
/// that are on (what ChainFltBefore left, where no gamma is applied).
template <bool Reverse> inline void ChainFltAfter(const Values &v, const OnMask &on, float (*__restrict p)[4],
                                                  const float (*__restrict x)[4], int n) {
    if constexpr (!Reverse) {
        const float contrast = v.finalContrast, bright = v.bright;
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) p[k][c] = on.Pick(c, (x[k][c] - 0.5f) * contrast + 0.5f + bright, p[k][c]);
        if (v.doSat) {
            const float sat = v.sat, _sat = v._sat;
            for (int k = 0; k < n; ++k) {
                const float y = 0.299f * p[k][0] + 0.587f * p[k][1] + 0.114f * p[k][2];
                for (int c = 0; c < 3; ++c) p[k][c] = on.Pick(c, p[k][c] * sat + y * _sat, p[k][c]);
            }
        }
        if (v.useLowHigh) {
            const float low = v.low, scale = v.finalScale;
            for (int k = 0; k < n; ++k)
                for (int c = 0; c < 4; ++c) p[k][c] = on.Pick(c, (p[k][c] - low) * scale, p[k][c]);
        }
    } else {
        const float lift = v.lift, gain = v.gain;
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) p[k][c] = on.Pick(c, (x[k][c] - lift) * gain, p[k][c]);
    }
    if (v.prePost)
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 3; ++c) p[k][c] = on.Pick(c, p[k][c] * p[k][3], p[k][c]);
    if (v.clipBlack)
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) p[k][c] = on.Pick(c, p[k][c] < 0.f ? 0.f : p[k][c], p[k][c]);
    if (v.clipWhite)
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) p[k][c] = on.Pick(c, p[k][c] > 1.f ? 1.f : p[k][c], p[k][c]);
}

/// The whole chain, forward or reverse, on up to kFltBlock float pixels in
/// place: the steps before the gamma, the gamma (`pow`) once per channel that
/// is on, over that channel's values regrouped into contiguous memory, then
/// the steps after it. Every float row and the canvas colour go through here.
template <bool Reverse, class Pow> void ChainFlt(const Values &v, const Pow &pow, float (*px)[4], int n) {
    float x[kFltBlock][4]; // the gamma's inputs and results, pixel by pixel
    const OnMask on(v.chans);
    ChainFltBefore<Reverse>(v, on, px, x, n);
    if (v.doGamma) {
        float planes[4][kFltBlock];
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) planes[c][k] = x[k][c];
        for (int c = 0; c < 4; ++c)
            if (v.chans[c]) pow(planes[c], n);
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) x[k][c] = planes[c][k];
    }
    ChainFltAfter<Reverse>(v, on, px, x, n);
}

/// RGBA float32 or float16 rows with fast powers, in blocks: float32 is
/// worked on in the output row itself.
template <bool Reverse, bool Half> void VectorSpan(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    const TruePower pow{v.gamma};
    if constexpr (Half) {
        float px[kFltBlock][4];
        for (int i = 0; i < count; i += kFltBlock) {
            const int n = std::min(kFltBlock, count - i);
            const auto *in = reinterpret_cast<const uint16_t *>(src) + static_cast<size_t>(i) * 4;
            auto *out = reinterpret_cast<uint16_t *>(dst) + static_cast<size_t>(i) * 4;
            for (int k = 0; k < n; ++k)
                for (int c = 0; c < 4; ++c) px[k][c] = HalfToFloat(in[4 * k + c]);
            ChainFlt<Reverse>(v, pow, px, n);
            for (int k = 0; k < n; ++k)
                for (int c = 0; c < 4; ++c) out[4 * k + c] = FloatToHalf(px[k][c]);
        }
    } else {
        auto *px = reinterpret_cast<float(*)[4]>(dst);
        for (int i = 0; i < count; i += kFltBlock) {
            const int n = std::min(kFltBlock, count - i);
            const uint8_t *in = src + static_cast<size_t>(i) * sizeof px[0];
            if (in != dst + static_cast<size_t>(i) * sizeof px[0]) std::memcpy(px + i, in, n * sizeof px[0]);
            ChainFlt<Reverse>(v, pow, px + i, n);
        }
    }
}

/// Any float depth, through FltPixel: with fast powers (float masks, or
/// vector rows switched off) or the table.
template <bool Reverse, class Pow>
void GeneralSpan(const Values &v, const Pow &pow, const uint8_t *src, uint8_t *dst, int count) {
    const int bpp = FormatOfDepth(v.depth).BytesPerPixel();
    FltPixel block[kFltBlock];
    float px[kFltBlock][4];
    for (int i = 0; i < count; i += kFltBlock) {
        const int n = std::min(kFltBlock, count - i);
        LoadFlt(v.depth, src + static_cast<size_t>(i) * bpp, n, block);
        for (int k = 0; k < n; ++k) {
            px[k][0] = block[k].R, px[k][1] = block[k].G, px[k][2] = block[k].B, px[k][3] = block[k].A;
        }
        ChainFlt<Reverse>(v, pow, px, n);
        for (int k = 0; k < n; ++k) block[k] = {px[k][0], px[k][1], px[k][2], px[k][3]};
        StoreFlt(v.depth, block, n, dst + static_cast<size_t>(i) * bpp);
    }
}

/// Any float depth with fast powers, when the vector rows do not apply.
template <bool Reverse> void FastPowerSpan(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    GeneralSpan<Reverse>(v, TruePower{v.gamma}, src, dst, count);
}

/// Any float depth without fast powers: gamma from the table.
template <bool Reverse> void TableSpan(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    GeneralSpan<Reverse>(v, TablePower{v.table}, src, dst, count);
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
    if (fastPower) return reverse ? &FastPowerSpan<true> : &FastPowerSpan<false>;
    return reverse ? &TableSpan<true> : &TableSpan<false>;
}

/// A float colour through the chain the float rows use.
FltPixel ChainOfColor(const Values &v, bool fastPower, const FltPixel &px) {
    float p[1][4] = {{px.R, px.G, px.B, px.A}};
    if (fastPower) {
        if (v.reverse)
            ChainFlt<true>(v, TruePower{v.gamma}, p, 1);
        else
            ChainFlt<false>(v, TruePower{v.gamma}, p, 1);
    } else {
        if (v.reverse)
            ChainFlt<true>(v, TablePower{v.table}, p, 1);
        else
            ChainFlt<false>(v, TablePower{v.table}, p, 1);
    }
    return {p[0][0], p[0][1], p[0][2], p[0][3]};
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

bool BrightnessContrast::RunDevice(Request *req, const Image *src, Image *dst) {
    const Values &v = v_;
    auto block = std::make_shared<BrightnessContrastParams>();
    BrightnessContrastParams &p = *block;
    const FltPixel canvas = dst->GetCanvasColor(); // already through the chain
    const float dp[4] = {canvas.R, canvas.G, canvas.B, canvas.A};
    std::memcpy(p.dp, dp, sizeof dp);
    for (int c = 0; c < 4; ++c) p.chans[c] = v.chans[c];
    p.prePost = v.prePost, p.doGamma = v.doGamma, p.doSat = v.doSat, p.useLowHigh = v.useLowHigh;
    p.clipBlack = v.clipBlack, p.clipWhite = v.clipWhite;
    p.gain = v.gain, p.gamma = v.gamma, p.lift = v.lift, p.finalContrast = v.finalContrast, p.bright = v.bright;
    float *satRows[3] = {p.satMat_v1, p.satMat_v2, p.satMat_v3};
    for (int r = 0; r < 3; ++r) {
        for (int c = 0; c < 3; ++c) satRows[r][c] = v.satRows[r][c];
        satRows[r][3] = 0.f;
    }
    p.sat = v.sat, p._sat = v._sat, p.finalScale = v.finalScale, p.low = v.low;
    SetPointKernelWindows(p, *src, *dst);
    // The span of each row the kernel reads from the input (windows are x0, x1, y0, y1).
    p.x0 = std::min(p.inDataWindow[0], p.outDataWindow[1]);
    p.x1 = std::min(p.inDataWindow[1], p.outDataWindow[1]);
    return KROMComputeNode::ExecKernelI(
        req, v.reverse ? "BrightnessContrastReverse" : "BrightnessContrast", nullptr, BrightnessContrastParamsText,
        sizeof p, offsetof(BrightnessContrastParams, srcCompOrder), offsetof(BrightnessContrastParams, dstCompOrder),
        block, {{"input", const_cast<Image *>(src)}, {"output", dst}});
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
    Ref<Image> dst = NewPointOutput(req, input_, src, clipping);
    auto outOfMemory = [&] {
        FailOutOfMemory(req);
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
        const SpanFunction span = ChooseSpan(v.depth, v.reverse, fastPower, vectorRows);
        uint8_t canvasPixel[16];

        // The canvas colour through the same function, also stored in the
        // output's depth for the spans beyond the input's window.
        if (isFloat) {
            const FltPixel canvas = ChainOfColor(v, fastPower, src->GetCanvasColor());
            dst->SetCanvasColor(canvas);
            StoreFlt(v.depth, &canvas, 1, canvasPixel);
        } else {
            Pixel canvas;
            src->GetCanvasColor(canvas);
            canvas = v.reverse ? PixelInt<true>(v, canvas) : PixelInt<false>(v, canvas);
            dst->SetCanvasColor(canvas);
            StorePixel(v.depth, &canvas, 1, canvasPixel);
        }

        const bool rowsWanted = !precalc && !dst->ValidWindow().IsNull();
        const bool onDevice = rowsWanted && IsGPUEnabled(req, true) && RunDevice(req, src, dst.Get());
        if (rowsWanted && !onDevice) {
            if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return outOfMemory();
            const PointRows rows(*src, *dst, canvasPixel);
            DoMultiProcess(
                [&](int i) { rows.Row(i, [&](const uint8_t *in, uint8_t *out, int n) { span(v, in, out, n); }); },
                rows.Count());
        }
    }

    // 5. With clipping, what lies beyond the window keeps the input's canvas.
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
