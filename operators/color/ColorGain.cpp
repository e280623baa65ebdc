#include "operators/color/ColorGain.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstring>
#include <memory>
#include <string>

#include "host/color/FastPow.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/KROMParams.h"
#include "host/krom/PointKernel.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_ColorGain("ColorGain");
static ClassRegistration<ColorGain, ThreadedOperator>
    s_Registration(CLSID_ColorGain, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/ColorGain"},
                    {RegName, "Color Gain"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "CG"},
                    {RegHelp, "Adjusts gain, lift, gamma and saturation per channel"},
                    {RegIcon, "Icons.Tools.Icons.ColorGain"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

Ref<Image> RunGainMatrix(ThreadedOperator &op, Request *req, const Input *in, const Image *src,
                         const ColorMatrixFull &matrix) {
    const OvID clipping = op.GetClippingMode(req);
    Ref<Image> dst = NewPointOutput(req, in, src, clipping);
    if (!dst) return dst;
    TagList tags{{WorkOperator, &op},
                 {WorkThreaded, 1},
                 {WorkUseGPU, !req->IsPreCalc() && op.IsGPUEnabled(req, false)},
                 {WorkRequest, req},
                 {MtxColorMatrixFull, &matrix}};
    if (!ApplyMatrixTagList(src, dst.Get(), tags)) return {};
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
    return dst;
}

namespace {

using Step = ColorGain::Step;
using Values = ColorGain::Values;

/// Settings closer than this to their neutral value count as neutral.
constexpr double kEps = 1.1920929e-07;
/// Pixels the rows take at a time.
constexpr int kBlock = 256;
/// Rec. 709 luminance weights: saturation turns about this grey, and the
/// tonal ranges are told apart by it.
constexpr float kLumR = 0.2126f, kLumG = 0.7152f, kLumB = 0.0722f;

bool Near(double a, double b) { return std::fabs(a - b) < kEps; }

/// 3t^2 - 2t^3 of t clamped to 0..1: the smooth edge of the range weights.
float SmoothEdge(float t) {
    t = std::clamp(t, 0.f, 1.f);
    return t * t * (3.f - 2.f * t);
}

/// Gain and lift on n pixels.
void GainLift(const Step &s, float (*p)[4], int n) {
    for (int k = 0; k < n; ++k)
        for (int c = 0; c < 4; ++c) p[k][c] = p[k][c] * s.gain[c] + s.lift[c];
}

/// The power and the saturation on n pixels, after GainLift.
void PowerSat(const Step &s, float (*p)[4], int n) {
    if (s.doPower) {
        float plane[kBlock];
        for (int c = 0; c < 4; ++c) {
            if (!s.power[c]) continue;
            for (int k = 0; k < n; ++k) plane[k] = p[k][c];
            PowAbsSigned(plane, s.exponent[c], plane, n);
            for (int k = 0; k < n; ++k) p[k][c] = plane[k];
        }
    }
    if (s.doSat)
        for (int k = 0; k < n; ++k) {
            const float y = kLumR * p[k][0] + kLumG * p[k][1] + kLumB * p[k][2];
            for (int c = 0; c < 3; ++c) p[k][c] = y + s.sat[c] * (p[k][c] - y);
        }
}

/// The tonal ranges on n pixels that have had the overall step: each range's
/// step, weighted by the range's share of the pixel's luminance, added as a
/// change: p + sum of w_r * (F_r(p) - p).
void Ranges(const Values &v, float (*p)[4], int n) {
    float w[kBlock][3], q[kBlock][4], sum[kBlock][4];
    for (int k = 0; k < n; ++k) {
        ColorGain::RangeWeights(v, kLumR * p[k][0] + kLumG * p[k][1] + kLumB * p[k][2], w[k]);
        for (int c = 0; c < 4; ++c) sum[k][c] = p[k][c];
    }
    for (int r = 0; r < 3; ++r) {
        const Step &s = v.range[r];
        if (s.neutral) continue;
        std::memcpy(q, p, sizeof q[0] * static_cast<size_t>(n));
        GainLift(s, q, n);
        PowerSat(s, q, n);
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) sum[k][c] += w[k][r] * (q[k][c] - p[k][c]);
    }
    std::memcpy(p, sum, sizeof sum[0] * static_cast<size_t>(n));
}

/// The whole function on n float pixels in place.
void ChainFlt(const Values &v, float (*p)[4], int n) {
    GainLift(v.overall, p, n);
    PowerSat(v.overall, p, n);
    if (v.doRanges) Ranges(v, p, n);
}

/// RGBA float32 rows, worked on in the output row itself.
void SpanFlt32(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    if (src != dst) std::memcpy(dst, src, static_cast<size_t>(count) * 16);
    auto *px = reinterpret_cast<float(*)[4]>(dst);
    for (int i = 0; i < count; i += kBlock) ChainFlt(v, px + i, std::min(kBlock, count - i));
}

/// Any other float depth (half floats, float masks), through FltPixel.
void SpanGeneral(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    const int bpp = FormatOfDepth(v.depth).BytesPerPixel();
    FltPixel block[kBlock];
    float px[kBlock][4];
    for (int i = 0; i < count; i += kBlock) {
        const int n = std::min(kBlock, count - i);
        LoadFlt(v.depth, src + static_cast<size_t>(i) * bpp, n, block);
        for (int k = 0; k < n; ++k)
            px[k][0] = block[k].R, px[k][1] = block[k].G, px[k][2] = block[k].B, px[k][3] = block[k].A;
        ChainFlt(v, px, n);
        for (int k = 0; k < n; ++k) block[k] = {px[k][0], px[k][1], px[k][2], px[k][3]};
        StoreFlt(v.depth, block, n, dst + static_cast<size_t>(i) * bpp);
    }
}

/// 8 or 16-bit RGBA rows: the overall gain, lift and power from the tables,
/// the rest in float, stored rounded to the nearest value.
template <class T> void SpanInt(const Values &v, const uint8_t *src, uint8_t *dst, int count) {
    const auto *in = reinterpret_cast<const T *>(src);
    auto *out = reinterpret_cast<T *>(dst);
    float px[kBlock][4];
    Step rest = v.overall;
    rest.doPower = false; // the tables hold it
    for (int i = 0; i < count; i += kBlock) {
        const int n = std::min(kBlock, count - i);
        const T *a = in + static_cast<size_t>(i) * 4;
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) px[k][c] = v.table[c][a[4 * k + c]];
        PowerSat(rest, px, n);
        if (v.doRanges) Ranges(v, px, n);
        T *b = out + static_cast<size_t>(i) * 4;
        for (int k = 0; k < n; ++k)
            for (int c = 0; c < 4; ++c) {
                if constexpr (sizeof(T) == 1)
                    b[4 * k + c] = FloatToU8(px[k][c]);
                else
                    b[4 * k + c] = FloatToU16(px[k][c]);
            }
    }
}

/// Reads one number from a request.
struct Reader {
    Request *req;
    double operator()(const Input *in) const { return req->GetInputNumber(in); }
};

// The device kernel: the float rows' steps in their order, with the device's
// powf for the power. Step s, channel c is entry 4 s + c of the arrays (s 0 the
// whole image, 1 to 3 shadows, midtones, highlights); dp is the processed
// canvas colour; windows are x0, x1, y0, y1.
KROM_PARAM_STRUCT(ColorGainParams, {
    float dp[4];
    float gain[16], lift[16], exponent[16], sat[16];
    int power[16];
    int doSat[4], active[4];
    float shadowsEnd, highlightsStart;
    int doRanges, unused;
    int inDataWindow[4];
    int outDataWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(ColorGainParams) == 432);
static_assert(offsetof(ColorGainParams, inDataWindow) == 384);
static_assert(offsetof(ColorGainParams, srcCompOrder) == 424);

const char kColorGainKernel[] = R"KROM(
KROM_FN void cg_step(__CONSTANTREF__ ColorGainParams *q, int s, float *p) {
    for (int c = 0; c < 4; ++c) {
        float x = p[c] * q->gain[4 * s + c] + q->lift[4 * s + c];
        if (q->power[4 * s + c]) x = _copysignf(_powf(_fabs(x), q->exponent[4 * s + c]), x);
        p[c] = x;
    }
    if (q->doSat[s]) {
        const float y = 0.2126f * p[0] + 0.7152f * p[1] + 0.0722f * p[2];
        for (int c = 0; c < 3; ++c) p[c] = y + q->sat[4 * s + c] * (p[c] - y);
    }
}

KROM_FN float cg_edge(float t) {
    t = _fminf(_fmaxf(t, 0.f), 1.f);
    return t * t * (3.f - 2.f * t);
}

KROM_FN float4 cg_chain(__CONSTANTREF__ ColorGainParams *q, float4 in) {
    float p[4] = {in.x, in.y, in.z, in.w};
    cg_step(q, 0, p);
    if (q->doRanges) {
        const float y = 0.2126f * p[0] + 0.7152f * p[1] + 0.0722f * p[2];
        const float s = q->shadowsEnd > 0.f ? cg_edge(y / q->shadowsEnd) : (y > 0.f ? 1.f : 0.f);
        const float hw = 1.f - q->highlightsStart;
        const float h = hw > 0.f ? cg_edge((y - q->highlightsStart) / hw) : (y >= 1.f ? 1.f : 0.f);
        float w[3];
        w[0] = 1.f - s;
        w[2] = h;
        w[1] = 1.f - w[0] - w[2];
        float sum[4] = {p[0], p[1], p[2], p[3]};
        for (int r = 0; r < 3; ++r) {
            if (!q->active[r + 1]) continue;
            float t[4] = {p[0], p[1], p[2], p[3]};
            cg_step(q, r + 1, t);
            for (int c = 0; c < 4; ++c) sum[c] += w[r] * (t[c] - p[c]);
        }
        for (int c = 0; c < 4; ++c) p[c] = sum[c];
    }
    return make_float4(p[0], p[1], p[2], p[3]);
}

__KERNEL__ void ColorGain(__CONSTANTREF__ ColorGainParams *p_pParams, __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int2 pos = make_int2(x + p_pParams->outDataWindow[0], y + p_pParams->outDataWindow[2]);
    float4 c = to_float4_v(p_pParams->dp);
    if (IsInsideROI(pos, p_pParams->inDataWindow))
        c = cg_chain(p_pParams, _tex2DVecN(input, pos.x - p_pParams->inDataWindow[0],
                                           pos.y - p_pParams->inDataWindow[2], p_pParams->srcCompOrder));
    _tex2DVec4Write(output, x, y, make_intensity(c, p_pParams->dstCompOrder));
}
)KROM";

} // namespace

void ColorGain::RangeWeights(const Values &v, float y, float w[3]) {
    // Shadows fall from 1 at black to 0 at shadowsEnd, highlights rise from 0
    // at highlightsStart to 1 at white, midtones take what is left; a range of
    // no width is a step.
    const float s = v.shadowsEnd > 0.f ? SmoothEdge(y / v.shadowsEnd) : (y > 0.f ? 1.f : 0.f);
    const float hw = 1.f - v.highlightsStart;
    const float h = hw > 0.f ? SmoothEdge((y - v.highlightsStart) / hw) : (y >= 1.f ? 1.f : 0.f);
    w[0] = 1.f - s;
    w[2] = h;
    w[1] = 1.f - w[0] - w[2];
}

ColorGain::ColorGain(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    static const char *const kStepNames[kSteps] = {"", "Shadows", "Midtones", "Highlights"};
    static const char *const kPages[kSteps] = {"Controls", "Shadows", "Midtones", "Highlights"};
    static const char *const kChannelNames[kChannels] = {"Red", "Green", "Blue", "Alpha", ""};
    // ID "ShadowsRedGain", name "Shadows Red Gain"; the overall master is "Gain".
    auto slider = [this](const char *step, const char *channel, const char *what, double def, double low, double high,
                         bool positive) {
        std::string id, name;
        for (const char *part : {step, channel, what}) {
            if (!*part) continue;
            id += part;
            name += (name.empty() ? "" : " ") + std::string(part);
        }
        TagList t{{LinkDataType, CLSID_DataType_Number},
                  {InputControl, CLSID_InputControl_Slider},
                  {InputDefault, def},
                  {InputSliderLow, low},
                  {InputSliderHigh, high},
                  {SliderSteps, 201},
                  {SliderRest, def}};
        if (positive) t.Set({InputMinAllowed, 0.0});
        return AddInputTagList(name.c_str(), id.c_str(), t);
    };
    for (int s = 0; s < kSteps; ++s) {
        AddControlPageTagList(kPages[s], {});
        const char *step = kStepNames[s];
        // Master first, then the channels.
        for (int c : {4, 0, 1, 2, 3}) gain_[s][c] = slider(step, kChannelNames[c], "Gain", 1.0, 0.0, 2.0, false);
        for (int c : {4, 0, 1, 2, 3}) lift_[s][c] = slider(step, kChannelNames[c], "Lift", 0.0, -0.5, 0.5, false);
        for (int c : {4, 0, 1, 2, 3}) gamma_[s][c] = slider(step, kChannelNames[c], "Gamma", 1.0, 0.0, 3.0, true);
        for (int c : {3, 0, 1, 2})
            sat_[s][c] = slider(step, c == 3 ? "" : kChannelNames[c], "Saturation", 1.0, 0.0, 3.0, true);
        // The boundary of the range on this page, 0..1 of luminance.
        Input **boundary = s == 1 ? &shadowsEnd_ : s == 3 ? &highlightsStart_ : nullptr;
        if (boundary)
            *boundary =
                AddInputTagList(s == 1 ? "Shadows End" : "Highlights Start", s == 1 ? "ShadowsEnd" : "HighlightsStart",
                                {{LinkDataType, CLSID_DataType_Number},
                                 {InputControl, CLSID_InputControl_Slider},
                                 {InputDefault, 0.5},
                                 {InputMinAllowed, 0.0},
                                 {InputMaxAllowed, 1.0},
                                 {SliderSteps, 101}});
    }
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

ColorGain::~ColorGain() = default;

bool ColorGain::ReadValues(Request *req) {
    const Reader read{req};
    Values v;
    for (int s = 0; s < kSteps; ++s) {
        Step &st = s == 0 ? v.overall : v.range[s - 1];
        // The master values act on red, green and blue; alpha has only its own.
        const double masterGain = read(gain_[s][4]), masterLift = read(lift_[s][4]), masterGamma = read(gamma_[s][4]);
        for (int c = 0; c < 4; ++c) {
            const bool color = c < 3;
            const double gain = (color ? masterGain : 1.0) * read(gain_[s][c]);
            const double lift = (color ? masterLift : 0.0) + read(lift_[s][c]);
            const double gamma = (color ? masterGamma : 1.0) * read(gamma_[s][c]);
            st.gain[c] = static_cast<float>(gain);
            st.lift[c] = static_cast<float>(lift);
            st.exponent[c] = static_cast<float>(gamma < 1e-5 ? 1e5 : 1.0 / gamma);
            st.power[c] = !Near(gamma, 1.0);
            st.doPower = st.doPower || st.power[c];
            st.neutral = st.neutral && Near(gain, 1.0) && Near(lift, 0.0) && !st.power[c];
        }
        for (int c = 0; c < 3; ++c) {
            const double sat = read(sat_[s][3]) * read(sat_[s][c]);
            st.sat[c] = static_cast<float>(sat);
            st.doSat = st.doSat || !Near(sat, 1.0);
        }
        st.neutral = st.neutral && !st.doSat;
        if (s > 0) v.doRanges = v.doRanges || !st.neutral;
    }
    const double shadowsEnd = read(shadowsEnd_), highlightsStart = read(highlightsStart_);
    if (shadowsEnd > highlightsStart) {
        Fail(req, "%s: Shadows End (%g) lies above Highlights Start (%g)\n", Name().c_str(), shadowsEnd,
             highlightsStart);
        return false;
    }
    v.shadowsEnd = static_cast<float>(shadowsEnd);
    v.highlightsStart = static_cast<float>(highlightsStart);
    v_ = v;
    return true;
}

ColorMatrixFull ColorGain::LinearMatrix() const {
    const Step &s = v_.overall;
    ColorMatrixFull m;
    for (int c = 0; c < 4; ++c) m.Scale(c, s.gain[c]).Offset(c, s.lift[c]);
    if (s.doSat) {
        ColorMatrixFull sat;
        const double lum[3] = {kLumR, kLumG, kLumB};
        for (int i = 0; i < 3; ++i)
            for (int j = 0; j < 3; ++j) sat.m[i][j] = (i == j ? s.sat[i] : 0.0) + (1.0 - s.sat[i]) * lum[j];
        m.Then(sat);
    }
    return m;
}

void ColorGain::BuildTables() {
    const Step &s = v_.overall;
    const bool eight = v_.depth == DepthRGBAInt8;
    const int depth = v_.depth;
    const auto same = [](const Step &a, const Step &b) {
        return std::memcmp(a.gain, b.gain, sizeof a.gain) == 0 && std::memcmp(a.lift, b.lift, sizeof a.lift) == 0 &&
               std::memcmp(a.exponent, b.exponent, sizeof a.exponent) == 0 &&
               std::memcmp(a.power, b.power, sizeof a.power) == 0;
    };
    if (tableDepth_ != depth || !same(tableStep_, s)) {
        const int codes = eight ? 256 : 65536;
        const double top = codes - 1;
        for (int c = 0; c < 4; ++c) {
            tables_[c].resize(static_cast<size_t>(codes));
            for (int i = 0; i < codes; ++i) {
                const double x = i / top * s.gain[c] + s.lift[c];
                const double y = s.power[c] ? std::copysign(std::pow(std::fabs(x), double(s.exponent[c])), x) : x;
                tables_[c][static_cast<size_t>(i)] = static_cast<float>(y);
            }
        }
        tableStep_ = s;
        tableDepth_ = depth;
    }
    for (int c = 0; c < 4; ++c) v_.table[c] = tables_[c].data();
}

bool ColorGain::RunDevice(Request *req, const Image *src, Image *dst) const {
    auto block = std::make_shared<ColorGainParams>();
    ColorGainParams &p = *block;
    std::memset(&p, 0, sizeof p);
    const FltPixel canvas = dst->GetCanvasColor(); // already through the chain
    const float dp[4] = {canvas.R, canvas.G, canvas.B, canvas.A};
    std::memcpy(p.dp, dp, sizeof dp);
    for (int s = 0; s < kSteps; ++s) {
        const Step &st = s == 0 ? v_.overall : v_.range[s - 1];
        for (int c = 0; c < 4; ++c) {
            p.gain[4 * s + c] = st.gain[c], p.lift[4 * s + c] = st.lift[c], p.exponent[4 * s + c] = st.exponent[c];
            p.power[4 * s + c] = st.power[c];
            if (c < 3) p.sat[4 * s + c] = st.sat[c];
        }
        p.doSat[s] = st.doSat, p.active[s] = !st.neutral;
    }
    p.shadowsEnd = v_.shadowsEnd, p.highlightsStart = v_.highlightsStart, p.doRanges = v_.doRanges;
    SetPointKernelWindows(p, *src, *dst);
    return KROMComputeNode::ExecKernelI(
        req, "ColorGain", kColorGainKernel, ColorGainParamsText, sizeof p, offsetof(ColorGainParams, srcCompOrder),
        offsetof(ColorGainParams, dstCompOrder), block, {{"input", const_cast<Image *>(src)}, {"output", dst}});
}

void ColorGain::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src || !ReadValues(req)) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const Values &v = v_;
    // 1. Nothing to do: hand the input on.
    if (v.overall.neutral && !v.doRanges) {
        req->SetOutputData(output_, src);
        return;
    }
    auto outOfMemory = [&] {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
    };
    // 2. Linear: one matrix.
    if (!v.overall.doPower && !v.doRanges) {
        Ref<Image> dst = RunGainMatrix(*this, req, input_, src, LinearMatrix());
        if (!dst) return outOfMemory();
        req->SetOutputData(output_, dst.Get());
        return;
    }
    // 3. Rows.
    const OvID clipping = GetClippingMode(req);
    Ref<Image> dst = NewPointOutput(req, input_, src, clipping);
    if (!dst) return outOfMemory();
    v_.depth = src->Depth();
    using Span = void (*)(const Values &, const uint8_t *, uint8_t *, int);
    Span span = &SpanGeneral;
    if (v_.depth == DepthRGBAFlt32) span = &SpanFlt32;
    if (v_.depth == DepthRGBAInt16) span = &SpanInt<uint16_t>;
    if (v_.depth == DepthRGBAInt8) span = &SpanInt<uint8_t>;

    const FltPixel in = src->GetCanvasColor();
    float canvas[1][4] = {{in.R, in.G, in.B, in.A}};
    ChainFlt(v, canvas, 1);
    const FltPixel out{canvas[0][0], canvas[0][1], canvas[0][2], canvas[0][3]};
    dst->SetCanvasColor(out);
    uint8_t canvasPixel[16];
    StoreFlt(v_.depth, &out, 1, canvasPixel);

    const bool rowsWanted = !req->IsPreCalc() && !dst->ValidWindow().IsNull();
    if (rowsWanted && !(IsGPUEnabled(req, true) && RunDevice(req, src, dst.Get()))) {
        if (span != &SpanGeneral && span != &SpanFlt32) BuildTables();
        if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return outOfMemory();
        const PointRows rows(*src, *dst, canvasPixel);
        DoMultiProcess([&](int i) { rows.Row(i, [&](const uint8_t *a, uint8_t *b, int n) { span(v, a, b, n); }); },
                       rows.Count());
    }
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
