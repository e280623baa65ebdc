#include "operators/key/UltraKeyerSteps.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstring>
#include <memory>
#include <type_traits>
#include <vector>

#include "host/core/Parallel.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/flow/ToolFrame.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/PointKernel.h"
#include "host/krom/kernels/UltraKeyerKernelParams.h"
#include "operators/key/KeyFunctions.h"

namespace Orvane {

namespace {

/// Values closer than this to zero (or to a default) count as it.
constexpr double kEps = 1.1920928955078125e-7;
/// Pixels a row step takes at a time.
constexpr int kBlock = 256;
/// The largest magnitude the 16-bit forms carry through raw, m and the
/// factors: beyond it every clamp that follows has long saturated.
constexpr int64_t kFixedLimit = int64_t(1) << 40;
constexpr int64_t kFactorLimit = int64_t(1) << 31;

/// Components in key order: c0 the key, then the other two (blue: B, R, G;
/// green: G, R, B; red: R, G, B).
constexpr int kOrder[3][3] = {{2, 0, 1}, {1, 0, 2}, {0, 1, 2}};

float Clamp01(float x) { return std::min(std::max(x, 0.f), 1.f); }

int64_t Clamp(int64_t x, int64_t lo, int64_t hi) { return std::min(std::max(x, lo), hi); }

/// x y / 65535 rounded, for x, y in 0..65535.
int64_t Mul16(int64_t x, int64_t y) {
    const int64_t p = x * y + 32768;
    return (p + (p >> 16)) >> 16;
}

/// The same for a signed x.
int64_t MulSigned16(int64_t x, int64_t y) { return x < 0 ? -Mul16(-x, y) : Mul16(x, y); }

/// a / b rounded half away from zero; b is not 0.
int64_t DivRound(int64_t a, int64_t b) {
    const int64_t half = (b < 0 ? -b : b) / 2;
    return (a < 0) == (b < 0) ? (a + (a < 0 ? -half : half)) / b : (a - (a < 0 ? -half : half)) / b;
}

// ---- the pre-matte ----

/// A limit of the box in 16-bit steps, rounded in float as the kernel does.
int Code16(float v) { return static_cast<int>(std::floor(std::clamp(v * 65535.f + 0.5f, -1.f, 65536.f))); }

/// The box in 16-bit steps.
struct Box16 {
    int low[4], high[4];
    explicit Box16(const PreMatteRanges &r) {
        for (int i = 0; i < 4; ++i) low[i] = Code16(r.low[i]), high[i] = Code16(r.high[i]);
    }
};

float PreMatteAlpha(const PreMatteRanges &box, float r, float g, float b) {
    float v[4];
    ChromaKeyAxes(0, r, g, b, v);
    const bool inside = v[0] >= box.low[0] && v[0] <= box.high[0] && v[1] >= box.low[1] && v[1] <= box.high[1] &&
                        v[2] >= box.low[2] && v[2] <= box.high[2] && v[3] >= box.low[3] && v[3] <= box.high[3];
    return inside ? 0.f : 1.f;
}

uint16_t PreMatteAlpha16(const Box16 &box, int r, int g, int b) {
    int32_t v[4];
    ChromaKeyAxes16(0, r, g, b, v);
    for (int i = 0; i < 4; ++i)
        if (v[i] < box.low[i] || v[i] > box.high[i]) return 65535;
    return 0;
}

// ---- the soft matte ----

float Raw(const UltraKeyerValues &v, const float c[3]) {
    if (v.bgDiv == 0.f) return 0.f;
    return (c[0] - (v.bgScale[0] * c[1] + v.bgScale[1] * c[2])) / v.bgDiv;
}

FltPixel SoftPixel(const UltraKeyerValues &v, const FltPixel &in) {
    const float src[3] = {in.R, in.G, in.B};
    float test[3] = {in.R, in.G, in.B};
    if (v.satr != 0.f) {
        const float y = KeyLuminance(in.R, in.G, in.B);
        for (float &t : test) t = v.sat * t - v.satr * y;
    }
    const int *o = kOrder[v.vlColor];
    float c[3], b[3];
    for (int i = 0; i < 3; ++i) c[i] = test[o[i]], b[i] = v.bgVal[o[i]];
    float raw = Raw(v, c);
    float a = 1.f - Clamp01(raw);
    if (v.passes > 0 && v.bgDiv != 0.f) {
        float s = v.correction;
        for (int pass = 0; pass < v.passes; ++pass) {
            const float t = std::min(1.f, s);
            s = s - t;
            const float a2 = a * t + (1.f - t);
            for (int i = 0; i < 3; ++i) c[i] = a2 * c[i] + (1.f - a2) * b[i];
            raw = Raw(v, c);
            a = 1.f - Clamp01(raw);
        }
    }
    if (!v.sub) return {in.R, in.G, in.B, a};
    const float m = raw * v.subSub;
    const float k = Clamp01(1.f - m * v.subMul);
    float out[3];
    for (int i = 0; i < 3; ++i) out[i] = (src[i] - std::min(std::max(v.bgVal[i] * m, 0.f), src[i])) * k;
    return {out[0], out[1], out[2], Clamp01(std::max(a, std::max(out[0], std::max(out[1], out[2]))))};
}

int64_t Raw16(const UltraKeyerValues &v, const int64_t c[3]) {
    if (v.bgDiv16 == 0) return 0;
    const int64_t num = c[0] - ((v.scale16[0] * c[1] + v.scale16[1] * c[2] + 32768) >> 16);
    return Clamp(DivRound(num * 65535, v.bgDiv16), -kFixedLimit, kFixedLimit);
}

Pixel SoftPixel16(const UltraKeyerValues &v, const Pixel &in) {
    const int64_t src[3] = {in.R, in.G, in.B};
    int64_t test[3] = {in.R, in.G, in.B};
    if (v.satr1024 != 0) {
        const int64_t y = KeyLuminance16(in.R, in.G, in.B);
        for (int64_t &t : test) t = Clamp((v.sat1024 * t - v.satr1024 * y) >> 10, -kFixedLimit, kFixedLimit);
    }
    const int *o = kOrder[v.vlColor];
    int64_t c[3], b[3];
    for (int i = 0; i < 3; ++i) c[i] = test[o[i]], b[i] = v.bg16[o[i]];
    int64_t raw = Raw16(v, c);
    int64_t a = 65535 - Clamp(raw, 0, 65535);
    if (v.passes > 0 && v.bgDiv16 != 0) {
        for (int pass = 0; pass < v.passes; ++pass) {
            const int64_t t = v.roundT16[pass];
            const int64_t a2 = Mul16(a, t) + 65535 - t;
            for (int i = 0; i < 3; ++i) c[i] = MulSigned16(c[i], a2) + Mul16(b[i], 65535 - a2);
            raw = Raw16(v, c);
            a = 65535 - Clamp(raw, 0, 65535);
        }
    }
    if (!v.sub) return {in.R, in.G, in.B, static_cast<uint16_t>(a)};
    const int64_t m = Clamp((raw * v.subSub16 + 32768) >> 16, -kFactorLimit, kFactorLimit);
    const int64_t k = 65535 - Clamp((m * v.subMul16 + 32768) >> 16, 0, 65535);
    int64_t out[3];
    for (int i = 0; i < 3; ++i) out[i] = Mul16(src[i] - Clamp(MulSigned16(m, v.bg16[i]), 0, src[i]), k);
    const int64_t alpha = std::max(a, std::max(out[0], std::max(out[1], out[2])));
    return {static_cast<uint16_t>(out[0]), static_cast<uint16_t>(out[1]), static_cast<uint16_t>(out[2]),
            static_cast<uint16_t>(alpha)};
}

// ---- subtract ----

float Restore(float c, float s, float a0, float a1) {
    if (a1 > a0) {
        const float t = a0 < 1.f ? (a1 - a0) / (1.f - a0) : 1.f;
        return std::min(c + (s - c) * t, s);
    }
    if (a1 < a0) return a0 == 0.f ? 0.f : c * a1 / a0;
    return c;
}

FltPixel SubtractPixel(const FltPixel &src, const FltPixel &cur, float a0) {
    return {Restore(cur.R, src.R, a0, cur.A), Restore(cur.G, src.G, a0, cur.A), Restore(cur.B, src.B, a0, cur.A),
            cur.A};
}

uint16_t Restore16(int64_t c, int64_t s, int64_t a0, int64_t a1) {
    if (a1 > a0) {
        const int64_t t = DivRound((a1 - a0) * 65535, 65535 - a0);
        return static_cast<uint16_t>(std::min(c + MulSigned16(s - c, t), s));
    }
    if (a1 < a0) return static_cast<uint16_t>(DivRound(c * a1, a0));
    return static_cast<uint16_t>(c);
}

Pixel SubtractPixel16(const Pixel &src, const Pixel &cur, int a0) {
    return {Restore16(cur.R, src.R, a0, cur.A), Restore16(cur.G, src.G, a0, cur.A), Restore16(cur.B, src.B, a0, cur.A),
            cur.A};
}

// ---- rows ----

/// The pixel types of the two forms, with their conversions.
template <class Px> struct Form;
template <> struct Form<FltPixel> {
    static void Load(int depth, const uint8_t *src, int n, FltPixel *dst) { LoadFlt(depth, src, n, dst); }
    static void Store(int depth, const FltPixel *src, int n, uint8_t *dst) { StoreFlt(depth, src, n, dst); }
    static FltPixel FromCanvas(const FltPixel &c) { return c; }
    static FltPixel ToCanvas(const FltPixel &p) { return p; }
};
template <> struct Form<Pixel> {
    static void Load(int depth, const uint8_t *src, int n, Pixel *dst) { LoadPixel(depth, src, n, dst); }
    static void Store(int depth, const Pixel *src, int n, uint8_t *dst) { StorePixel(depth, src, n, dst); }
    static Pixel FromCanvas(const FltPixel &c) { return FltToPixel(c); }
    static FltPixel ToCanvas(const Pixel &p) { return PixelToFlt(p); }
};

/// Runs fn(int y, int x0, int n) over blocks of the rows of `window` on the
/// workers; false when the render was abandoned.
template <class Fn> bool ForBlocks(const Image &img, const ImgRectI &window, const Fn &fn) {
    ParallelFor(window.Height(), [&](int i) {
        if (img.CheckAbort()) return;
        for (int x = window.x0; x < window.x1; x += kBlock) fn(window.y0 + i, x, std::min(kBlock, window.x1 - x));
    });
    return !img.CheckAbort();
}

/// n pixels of row y of `img` from x0 in form Px: its pixels inside its data
/// window (when it has rows), `canvas` elsewhere.
template <class Px> void ReadSpan(const Image &img, const Px &canvas, int y, int x0, int n, Px *out) {
    const ImgRectI in = img.HasScanLineData() ? img.DataWindow() : ImgRectI();
    const RowSpans s = SplitRow(ImgRectI(x0, y, x0 + n, y + 1), in, y);
    std::fill(out, out + (s.midStart - x0), canvas);
    if (s.hasInput)
        Form<Px>::Load(img.Depth(), img.PixelAddress(s.midStart, y), s.midEnd - s.midStart, out + (s.midStart - x0));
    std::fill(out + (s.midEnd - x0), out + n, canvas);
}

/// A colour through the function of the form `dst` is worked in.
template <class F16, class FF> FltPixel InForm(const Image &dst, const F16 &f16, const FF &ff, const FltPixel &c) {
    return dst.IsFloat() ? ff(c) : PixelToFlt(f16(FltToPixel(c)));
}

/// dst := fn(src pixel) over dst's data window in form Px, its side spans
/// filled with `canvas`, the result for src's canvas colour.
template <class Px, class Fn> bool PointRowsOf(const Image &src, Image &dst, const FltPixel &canvas, const Fn &fn) {
    if (!src.DownloadGPUMem() || !dst.AllocScanLineData()) return false;
    const Px canvasPx = Form<Px>::FromCanvas(canvas);
    uint8_t canvasPixel[16];
    Form<Px>::Store(dst.Depth(), &canvasPx, 1, canvasPixel);
    const PointRows rows(src, dst, canvasPixel);
    const int srcDepth = src.Depth(), dstDepth = dst.Depth();
    const size_t inBpp = static_cast<size_t>(src.BytesPerPixel()), outBpp = static_cast<size_t>(dst.BytesPerPixel());
    ParallelFor(rows.Count(), [&](int i) {
        rows.Row(i, [&](const uint8_t *in, uint8_t *out, int count) {
            Px block[kBlock];
            for (int x = 0; x < count; x += kBlock) {
                const int n = std::min(kBlock, count - x);
                Form<Px>::Load(srcDepth, in + static_cast<size_t>(x) * inBpp, n, block);
                for (int k = 0; k < n; ++k) block[k] = fn(block[k]);
                Form<Px>::Store(dstDepth, block, n, out + static_cast<size_t>(x) * outBpp);
            }
        });
    });
    dst.SetGPUMem(nullptr, false); // the rows hold the result now
    return !dst.CheckAbort();
}

/// A per-pixel step: the kernel `run` first when `device`, else the rows of
/// the form dst is worked in. The canvas colour goes through the same form.
template <class F16, class FF, class Run>
bool PointStep(const Image &src, Image &dst, bool device, const F16 &f16, const FF &ff, const Run &run) {
    const FltPixel canvas = InForm(dst, f16, ff, src.GetCanvasColor());
    dst.SetCanvasColor(canvas);
    if (dst.DataWindow().IsNull()) return true;
    if (device && run(canvas)) return true;
    return dst.IsFloat() ? PointRowsOf<FltPixel>(src, dst, canvas, ff) : PointRowsOf<Pixel>(src, dst, canvas, f16);
}

/// Combine in form Px over dst's data window.
template <class Px> bool CombineRows(Image &work, Image &dst) {
    const Px workCanvas = Form<Px>::FromCanvas(work.GetCanvasColor());
    const ImgRectI ww = work.HasScanLineData() ? work.DataWindow() : ImgRectI();
    const int depth = dst.Depth(), workDepth = work.Depth();
    return ForBlocks(dst, dst.DataWindow(), [&](int y, int x0, int n) {
        Px d[kBlock], w[kBlock];
        uint8_t *row = dst.PixelAddress(x0, y);
        Form<Px>::Load(depth, row, n, d);
        ReadSpan(work, workCanvas, y, x0, n, w);
        for (int k = 0; k < n; ++k) {
            const auto old = d[k].A;
            if constexpr (std::is_same_v<Px, Pixel>)
                d[k].A = static_cast<uint16_t>(Mul16(d[k].A, w[k].A));
            else
                d[k].A = d[k].A * w[k].A;
            w[k].A = old;
        }
        Form<Px>::Store(depth, d, n, row);
        const ImgRectI keep = ImgRectI(x0, y, x0 + n, y + 1) & ww;
        if (!keep.IsNull()) Form<Px>::Store(workDepth, w + (keep.x0 - x0), keep.Width(), work.PixelAddress(keep.x0, y));
    });
}

/// Subtract in form Px over dst's data window.
template <class Px> bool SubtractRows(const Image &src, Image &dst, const Image &old) {
    const Px srcCanvas = Form<Px>::FromCanvas(src.GetCanvasColor());
    const Px oldCanvas = Form<Px>::FromCanvas(old.GetCanvasColor());
    const int depth = dst.Depth();
    return ForBlocks(dst, dst.DataWindow(), [&](int y, int x0, int n) {
        Px s[kBlock], c[kBlock], o[kBlock];
        uint8_t *row = dst.PixelAddress(x0, y);
        Form<Px>::Load(depth, row, n, c);
        ReadSpan(src, srcCanvas, y, x0, n, s);
        ReadSpan(old, oldCanvas, y, x0, n, o);
        for (int k = 0; k < n; ++k) {
            if constexpr (std::is_same_v<Px, Pixel>)
                c[k] = SubtractPixel16(s[k], c[k], o[k].A);
            else
                c[k] = SubtractPixel(s[k], c[k], o[k].A);
        }
        Form<Px>::Store(depth, c, n, row);
    });
}

/// A block's canvas colour field.
void SetCanvasField(float *field, const FltPixel &c) {
    const float v[4] = {c.R, c.G, c.B, c.A};
    std::memcpy(field, v, sizeof v);
}

void SetWindow(int *field, const ImgRectI &r) {
    const int v[4] = {r.x0, r.x1, r.y0, r.y1};
    std::memcpy(field, v, sizeof v);
}

/// Runs a kernel of the library whose block is Params.
template <class Params> bool RunKernel(Request *req, const char *name, const char *paramsText,
                                       std::shared_ptr<Params> block,
                                       const std::vector<std::pair<const char *, Image *>> &images) {
    return KROMComputeNode::ExecKernelI(req, name, nullptr, paramsText, sizeof(Params), offsetof(Params, srcCompOrder),
                                        offsetof(Params, dstCompOrder), block, images);
}

/// A zeroed block.
template <class Params> std::shared_ptr<Params> NewBlock() {
    auto block = std::make_shared<Params>();
    std::memset(block.get(), 0, sizeof(Params));
    return block;
}

} // namespace

UltraKeyerValues DeriveUltraKeyerValues(const UltraKeyerSettings &s) {
    UltraKeyerValues v;
    const double r = s.background[0], g = s.background[1], b = s.background[2];
    v.vlColor = b >= g && b >= r ? 0 : g >= r ? 1 : 2;
    const int *o = kOrder[v.vlColor];
    const double w1 = std::clamp(s.weight1, 0.0, 1.0), w2 = std::clamp(s.weight2, 0.0, 1.0);
    const double div = s.background[o[0]] - (w1 * s.background[o[1]] + w2 * s.background[o[2]]);
    const bool zero = std::fabs(div) < kEps;
    const double satr = 5.0 * std::max(s.backgroundCorrection, 0.0), sat = satr + 1.0;
    const double total = 4.0 * std::clamp(s.matteSeparation, 0.0, 1.0);
    const double subSub = (s.subtractBackground ? 1.0 : 0.0) / sat, subMul = (total + 1.0) * sat - 1.0;
    for (int i = 0; i < 3; ++i) {
        v.bgVal[i] = static_cast<float>(s.background[i]);
        v.bg16[i] = static_cast<int32_t>(std::clamp(s.background[i] * 65535.0, 0.0, 65535.0));
    }
    v.bgScale[0] = static_cast<float>(w1), v.bgScale[1] = static_cast<float>(w2);
    v.bgDiv = zero ? 0.f : static_cast<float>(div);
    v.sat = static_cast<float>(sat), v.satr = static_cast<float>(satr);
    v.correction = static_cast<float>(total);
    v.passes = static_cast<int>(std::ceil(total));
    v.sub = s.subtractBackground;
    v.subSub = static_cast<float>(subSub), v.subMul = static_cast<float>(subMul);

    auto fixed = [](double x, double scale) {
        return Clamp(std::llround(std::clamp(x * scale, -1e15, 1e15)), -kFactorLimit, kFactorLimit);
    };
    v.scale16[0] = fixed(w1, 65536.0), v.scale16[1] = fixed(w2, 65536.0);
    v.bgDiv16 = zero ? 0 : fixed(div, 65535.0);
    v.sat1024 = fixed(sat, 1024.0), v.satr1024 = fixed(satr, 1024.0);
    v.subSub16 = fixed(subSub, 65536.0), v.subMul16 = fixed(subMul, 65536.0);
    // The rounds' shares of the separation, as the float form takes them.
    float left = v.correction;
    for (int pass = 0; pass < v.passes; ++pass) {
        const float t = std::min(1.f, left);
        left = left - t;
        v.roundT16[pass] = static_cast<int32_t>(std::lround(t * 65535.0));
    }
    return v;
}

bool PreMatteRanges::AtDefaults() const {
    for (int i = 0; i < 4; ++i)
        if (std::fabs(low[i]) >= kEps || std::fabs(high[i] - 1.f) >= kEps) return false;
    return true;
}

bool DoUltraKeyer(Request *req, const Image *src, Image *dst, const PreMatteRanges &ranges, bool device) {
    const Box16 box(ranges);
    const auto f16 = [&](const Pixel &p) { return Pixel{p.R, p.G, p.B, PreMatteAlpha16(box, p.R, p.G, p.B)}; };
    const auto ff = [&](const FltPixel &p) { return FltPixel{p.R, p.G, p.B, PreMatteAlpha(ranges, p.R, p.G, p.B)}; };
    return PointStep(*src, *dst, device, f16, ff, [&](const FltPixel &canvas) {
        auto block = NewBlock<UltraKeyerParams>();
        UltraKeyerParams &p = *block;
        SetCanvasField(p.dp, canvas);
        p.lowR = ranges.low[0], p.highR = ranges.high[0], p.lowG = ranges.low[1], p.highG = ranges.high[1];
        p.lowB = ranges.low[2], p.highB = ranges.high[2], p.lowLum = ranges.low[3], p.highLum = ranges.high[3];
        SetPointKernelWindows(p, *src, *dst);
        return RunKernel(req, "UltraKeyer", UltraKeyerParamsText, block,
                         {{"input", const_cast<Image *>(src)}, {"output", dst}});
    });
}

bool DoSoftUltraKeyer(Request *req, const Image *src, Image *dst, const UltraKeyerValues &v, bool device) {
    const auto f16 = [&](const Pixel &p) { return SoftPixel16(v, p); };
    const auto ff = [&](const FltPixel &p) { return SoftPixel(v, p); };
    return PointStep(*src, *dst, device, f16, ff, [&](const FltPixel &canvas) {
        auto block = NewBlock<UltraKeyerSoftParams>();
        UltraKeyerSoftParams &p = *block;
        SetCanvasField(p.dp, canvas);
        std::memcpy(p.bgVal, v.bgVal, sizeof p.bgVal);
        p.sat = v.sat, p.satr = v.satr, p.correction = v.correction, p.vlColor = v.vlColor;
        p.bgScale[0] = v.bgScale[0], p.bgScale[1] = v.bgScale[1], p.bgDiv = v.bgDiv;
        p.sub = v.sub, p.subSub = v.subSub, p.subMul = v.subMul, p.passes = v.passes;
        SetPointKernelWindows(p, *src, *dst);
        return RunKernel(req, "UltraKeyerSoft", UltraKeyerSoftParamsText, block,
                         {{"input", const_cast<Image *>(src)}, {"output", dst}});
    });
}

bool DoCombine(Request *req, Image *work, Image *dst, bool device) {
    const FltPixel workCanvas = work->GetCanvasColor();
    FltPixel dstCanvas = dst->GetCanvasColor(), keptCanvas = workCanvas;
    keptCanvas.A = dstCanvas.A;
    if (dst->IsFloat())
        dstCanvas.A = dstCanvas.A * workCanvas.A;
    else
        dstCanvas.A = static_cast<float>(Mul16(FltToPixel(dstCanvas).A, FltToPixel(workCanvas).A) / 65535.0);
    auto finish = [&](bool ok) {
        dst->SetCanvasColor(dstCanvas);
        work->SetCanvasColor(keptCanvas);
        return ok;
    };
    const ImgRectI dw = dst->DataWindow();
    if (dw.IsNull()) return finish(true);
    if (device && work->DataWindow() == dw && work->Depth() == dst->Depth()) {
        auto block = NewBlock<UltraKeyerCombineParams>();
        UltraKeyerCombineParams &p = *block;
        p.spw = workCanvas.A;
        SetWindow(p.inDataWindow, work->DataWindow());
        SetWindow(p.outDataWindow, dw);
        p.workSize[0] = dw.Width(), p.workSize[1] = dw.Height();
        if (RunKernel(req, "UltraKeyerCombine", UltraKeyerCombineParamsText, block,
                      {{"input", dst}, {"work", work}, {"output", dst}, {"outputWork", work}}))
            return finish(true);
    }
    if (!dst->DownloadGPUMem() || !work->DownloadGPUMem() || !dst->AllocScanLineData() || !work->AllocScanLineData())
        return false;
    const bool ok = dst->IsFloat() ? CombineRows<FltPixel>(*work, *dst) : CombineRows<Pixel>(*work, *dst);
    dst->SetGPUMem(nullptr, false), work->SetGPUMem(nullptr, false); // the rows hold the result now
    return finish(ok);
}

bool DoSubtract(Request *req, const Image *src, Image *dst, const Image *old, bool device) {
    const FltPixel sc = src->GetCanvasColor(), dc = dst->GetCanvasColor(), oc = old->GetCanvasColor();
    const FltPixel canvas = dst->IsFloat()
                                ? SubtractPixel(sc, dc, oc.A)
                                : PixelToFlt(SubtractPixel16(FltToPixel(sc), FltToPixel(dc), FltToPixel(oc).A));
    auto finish = [&](bool ok) {
        dst->SetCanvasColor(canvas);
        return ok;
    };
    const ImgRectI dw = dst->DataWindow();
    if (dw.IsNull()) return finish(true);
    if (device && old->DataWindow() == dw && old->Depth() == dst->Depth()) {
        auto block = NewBlock<UltraKeyerSubtractParams>();
        UltraKeyerSubtractParams &p = *block;
        SetCanvasField(p.sp, sc);
        SetPointKernelWindows(p, *src, *dst);
        if (RunKernel(req, "UltraKeyerSubtract", UltraKeyerSubtractParamsText, block,
                      {{"src", const_cast<Image *>(src)},
                       {"input", dst},
                       {"old", const_cast<Image *>(old)},
                       {"output", dst}}))
            return finish(true);
    }
    if (!src->DownloadGPUMem() || !old->DownloadGPUMem() || !dst->DownloadGPUMem() || !dst->AllocScanLineData())
        return false;
    const bool ok = dst->IsFloat() ? SubtractRows<FltPixel>(*src, *dst, *old) : SubtractRows<Pixel>(*src, *dst, *old);
    dst->SetGPUMem(nullptr, false); // the rows hold the result now
    return finish(ok);
}

} // namespace Orvane
