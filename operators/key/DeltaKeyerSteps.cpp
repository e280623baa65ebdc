#include "operators/key/DeltaKeyerSteps.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cmath>
#include <cstring>
#include <memory>
#include <utility>
#include <vector>

#include "host/color/ColorCurvesTable.h"
#include "host/core/Parallel.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMComputeNode.h"

namespace Orvane {

namespace {

/// Pixels the rows take at a time.
constexpr int kBlock = 256;
/// Below these the Status view counts alpha as clear, above them as solid.
constexpr float kStatusClear = 0.001f, kStatusSolid = 0.9999f;

// fmin and fmax as the kernels have them (a NaN operand gives the other),
// inline: the library calls cost more than the rest of a pixel.
inline float FMax(float a, float b) { return (a >= b || b != b) ? a : b; }
inline float FMin(float a, float b) { return (a <= b || b != b) ? a : b; }
float Clamp01(float v) { return FMin(FMax(v, 0.f), 1.f); }

/// Half-way toward colour (r, g, b).
void Tint(FltPixel &p, float r, float g, float b) {
    p.R = 0.5f * p.R + 0.5f * r;
    p.G = 0.5f * p.G + 0.5f * g;
    p.B = 0.5f * p.B + 0.5f * b;
}

bool Aborted(const Request *req, const Image *img) {
    return img->CheckAbort() || (req && req->GetTask() && req->GetTask()->IsAborted());
}

/// The pixels a step gets: one pointer per input (null for an absent input).
template <size_t N> using Inputs = std::array<const Image *, N>;
template <size_t N> using PixelsIn = std::array<const FltPixel *, N>;

/// The step's function on the inputs' canvas colours: the destination's canvas.
template <size_t N, class Fn> FltPixel CanvasOf(const Inputs<N> &ins, const Fn &fn) {
    std::array<FltPixel, N> canvas{};
    PixelsIn<N> at{};
    for (size_t k = 0; k < N; ++k)
        if (ins[k]) canvas[k] = ins[k]->GetCanvasColor(), at[k] = &canvas[k];
    FltPixel out;
    fn(at, &out, 1);
    return out;
}

/// Runs fn(inputs, out, n) over blocks of `dst`'s rows on the worker pool.
/// Spans no input reaches get the canvas result; `dst` may be an input.
template <size_t N, class Fn> bool Rows(const DeltaKeyerRun &run, Image *dst, const Inputs<N> &ins, const Fn &fn) {
    for (const Image *in : ins)
        if (in && !in->DownloadGPUMem()) return false;
    if (!dst->DownloadGPUMem() || (!dst->HasScanLineData() && !dst->AllocScanLineData())) return false;
    const FltPixel canvas = CanvasOf(ins, fn);
    ImgRectI reach;
    for (const Image *in : ins)
        if (in && in->HasScanLineData()) reach |= in->DataWindow();
    const ImgRectI dw = dst->DataWindow();
    const int depth = dst->Depth(), bpp = dst->BytesPerPixel();
    std::atomic<bool> stopped{false};
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            std::vector<FltPixel> buf(static_cast<size_t>(N + 1) * kBlock), fill(kBlock, canvas);
            PixelsIn<N> at{};
            FltPixel *out = buf.data() + static_cast<size_t>(N) * kBlock;
            auto fillCanvas = [&](uint8_t *row, int from, int to) {
                for (int x = from; x < to; x += kBlock)
                    StoreFlt(depth, fill.data(), std::min(kBlock, to - x), row + static_cast<size_t>(x - dw.x0) * bpp);
            };
            for (int y = y0; y < y1; ++y) {
                if (Aborted(run.req, dst)) {
                    stopped = true;
                    return;
                }
                uint8_t *row = dst->ScanLine(y);
                int a = dw.x1, b = dw.x1;
                if (y >= reach.y0 && y < reach.y1) {
                    a = std::clamp(reach.x0, dw.x0, dw.x1);
                    b = std::clamp(reach.x1, a, dw.x1);
                }
                fillCanvas(row, dw.x0, a);
                for (int x = a; x < b; x += kBlock) {
                    const int n = std::min(kBlock, b - x);
                    for (size_t k = 0; k < N; ++k) {
                        at[k] = nullptr;
                        if (!ins[k]) continue;
                        FltPixel *span = buf.data() + k * kBlock;
                        ReadSpanFlt(*ins[k], y, x, x + n, span);
                        at[k] = span;
                    }
                    fn(at, out, n);
                    StoreFlt(depth, out, n, row + static_cast<size_t>(x - dw.x0) * bpp);
                }
                fillCanvas(row, b, dw.x1);
            }
        },
        4);
    dst->SetCanvasColor(canvas);
    dst->SetGPUMem(nullptr, false); // main memory holds the only current copy now
    return !stopped;
}

// ---- the device side ----

/// An input's window for a kernel, x0, x1, y0, y1: empty when it has no pixels.
void Window(int w[4], const Image *img) {
    const bool has = img && (img->HasScanLineData() || img->IsGPUMemDirty());
    const ImgRectI r = has ? img->DataWindow() : ImgRectI();
    w[0] = r.x0, w[1] = r.x1, w[2] = r.y0, w[3] = r.y1;
}

void Put(float d[4], const FltPixel &p) { d[0] = p.R, d[1] = p.G, d[2] = p.B, d[3] = p.A; }
FltPixel Canvas(const Image *img) { return img ? img->GetCanvasColor() : FltPixel{}; }

/// Runs kernel `name` of the family with `block` over the destination (the
/// pair named "output"); on success the destination takes `canvas`.
template <class P> bool Device(const DeltaKeyerRun &run, const char *name, const std::shared_ptr<P> &block, Image *dst,
                               const FltPixel &canvas, const std::vector<std::pair<const char *, Image *>> &images) {
    if (!run.device || !run.req || dst->DataWindow().IsNull()) return false;
    Window(block->dstWindow, dst);
    block->workSize[0] = dst->DataWindow().Width();
    block->workSize[1] = dst->DataWindow().Height();
    if (!KROMComputeNode::ExecKernelI(run.req, name, nullptr, DeltaKeyerParamsText, sizeof(P),
                                      offsetof(P, srcCompOrder), offsetof(P, dstCompOrder), block, images))
        return false;
    dst->SetCanvasColor(canvas);
    return true;
}

/// A kernel argument for an input that may be absent: `stand` is bound in
/// its place (the kernel does not read it then).
Image *Arg(const Image *img, const Image *stand) { return const_cast<Image *>(img ? img : stand); }

/// The curve table as one row of samples: shadows, midtones, highlights in red,
/// green, blue, for a kernel to read.
Ref<Image> TableImage(const ColorCurvesTable &table) {
    auto img = MakeRef<Image>(ColorCurvesTable::kSamples, 1, DepthRGBAFlt32);
    if (!img->AllocScanLineData()) return nullptr;
    auto *row = img->Row<float>(0);
    for (int i = 0; i < ColorCurvesTable::kSamples; ++i) {
        std::memcpy(row + 4 * i, table.Sample(i), 3 * sizeof(float));
        row[4 * i + 3] = 0.f;
    }
    return img;
}

template <class P> std::shared_ptr<P> NewBlock() {
    auto block = std::make_shared<P>();
    std::memset(block.get(), 0, sizeof(P));
    return block;
}

// ---- per-pixel functions, shared by the rows and the canvas ----

/// The matte of colour p under a record (DeltaKeyerMatteValue), inline for the rows.
inline float MatteOf(const DeltaKeyerScreenInfo &info, const float p[3]) {
    const DeltaKeyerScreenInfoParams &r = info.p;
    float key = p[r.keyIndex];
    if (r.tuning && info.table) {
        float ws, wm, wh;
        info.table->WeightsAt(key, ws, wm, wh);
        key = key * r.shadowsGain * ws + key * r.midtonesGain * wm + key * r.highlightsGain * wh;
    }
    const float d = DeltaKeyerDenominator(r);
    if (d == 0.f) return 0.f;
    return (key - (r.midFactor * p[r.midIndex] + r.lowFactor * p[r.lowIndex])) * r.gain / d;
}

void ScreenPixels(const DeltaKeyerScreenInfo &color, const DeltaKeyerScreenInfo &alpha, bool same, const FltPixel *in,
                  const FltPixel *clean, FltPixel *out, int n) {
    DeltaKeyerScreenInfo c = color, a = alpha;
    for (int i = 0; i < n; ++i) {
        const float p[3] = {in[i].R, in[i].G, in[i].B};
        if (clean) {
            const float cc[3] = {clean[i].R, clean[i].G, clean[i].B};
            c.p = color.p, a.p = alpha.p;
            DeltaKeyerAdjustForClean(c.p, cc);
            DeltaKeyerAdjustForClean(a.p, cc);
        }
        const float m = MatteOf(c, p);
        float o[3];
        for (int k = 0; k < 3; ++k) o[k] = p[k] - FMin(FMax((c.p.background[k] + c.p.offset) * m, 0.f), p[k]);
        const float al = same ? m * c.p.gain : MatteOf(a, p) * a.p.gain;
        out[i] = {o[0], o[1], o[2], Clamp01(FMax(1.f - al, FMax(o[0], FMax(o[1], o[2]))))};
    }
}

float PreMatteValue(const DeltaKeyerPreMatteRanges &r, const FltPixel &s) {
    const float v[4] = {s.R, s.G, s.B, 0.299f * s.R + 0.587f * s.G + 0.114f * s.B};
    bool inside = true;
    for (int i = 0; i < 4; ++i) inside = inside && v[i] >= r.low[i] && v[i] <= r.high[i];
    if (inside) return 0.f;
    if (!(r.soft > 0.f)) return 1.f;
    float e = 0.f;
    for (int i = 0; i < 4; ++i) {
        const float out = FMax(FMax(v[i] - r.high[i], r.low[i] - v[i]), 0.f);
        e = FMax(e, FMin(out, r.soft) / r.soft);
    }
    return e;
}

float ThresholdValue(float a, float lo, float hi) {
    return hi > lo ? FMin(FMax(a - lo, 0.f) / (hi - lo), 1.f) : (a > lo ? 1.f : 0.f);
}

/// The replace rule on colour f (red, green, blue) from source s.
void ReplacePixel(int mode, const FltPixel &s, float a0, float a1, const float c[3], FltPixel &f) {
    if (mode == DeltaKeyerReplaceNone) return;
    float px[3] = {f.R, f.G, f.B};
    const float sp[3] = {s.R, s.G, s.B};
    const float da = a1 - a0;
    if (!(da > 0.f)) {
        const float k = a0 == 0.f ? 0.f : a1 / a0;
        for (float &v : px) v = v * k;
    } else if (mode == DeltaKeyerReplaceSource) {
        const float t = a0 >= 0.9999999f ? 0.f : da / (1.f - a0);
        for (int i = 0; i < 3; ++i) px[i] = px[i] + (sp[i] - px[i]) * t;
    } else if (mode == DeltaKeyerReplaceHardColor) {
        for (int i = 0; i < 3; ++i) px[i] = px[i] + da * c[i];
    } else {
        const float d = ((sp[0] - px[0]) + (sp[1] - px[1]) + (sp[2] - px[2])) * da / 3.f;
        for (int i = 0; i < 3; ++i) px[i] = px[i] + d * c[i];
    }
    f.R = px[0], f.G = px[1], f.B = px[2];
}

float MergeValue(float s, float d, bool invert, bool invertMask) {
    if (invertMask) s = 1.f - s;
    return invert ? (1.f - d) * (1.f - s) + s : (1.f - s) * d + s;
}

float StatusLevel(float a) { return a < kStatusClear ? 0.f : (a > kStatusSolid ? 1.f : 0.5f); }

} // namespace

// ---- records ----

bool BuildDeltaKeyerScreenInfo(const DeltaKeyerScreenInputs &in, DeltaKeyerScreenInfo &info) {
    DeltaKeyerScreenInfoParams &p = info.p;
    p = {};
    info.table = in.table;
    const float *bg = in.background;
    float rc[3];
    for (int c = 0; c < 3; ++c) {
        rc[c] = std::max(in.reference[c], 1e-6f);
        p.reference[c] = rc[c];
        p.background[c] = bg[c];
    }
    const double g = in.gain, b = in.balance;
    const double t = (double(bg[0]) + bg[1] + bg[2]) * (g - 1.0) / 3.0;
    const double v[3] = {(bg[0] + t) * 2.0 * rc[2] * 2.0 * rc[1], (bg[1] + t) * 2.0 * rc[2] * 2.0 * rc[0],
                         (bg[2] + t) * 2.0 * rc[1] * 2.0 * rc[0]};
    // Preference order on ties: green, blue, red.
    const int order[3] = {1, 2, 0};
    int key = order[0];
    for (int c : order)
        if (v[c] > v[key]) key = c;
    int others[2], n = 0;
    for (int c : order)
        if (c != key) others[n++] = c;
    // others[0] comes first in the preference order: it is "mid" unless smaller.
    const bool firstIsMid = v[others[0]] >= v[others[1]];
    const int mid = firstIsMid ? others[0] : others[1], low = firstIsMid ? others[1] : others[0];
    p.keyIndex = key, p.midIndex = mid, p.lowIndex = low;
    const double k1 = (rc[key] / double(rc[mid])) * b, k2 = (rc[key] / double(rc[low])) * (1.0 - b);
    p.midFactor = static_cast<float>(k1);
    p.lowFactor = static_cast<float>(k2);
    p.denomBase = static_cast<float>(bg[key] - (k1 * bg[mid] + k2 * bg[low]));
    p.gain = static_cast<float>(g);
    p.oneMinusFactors = static_cast<float>(1.0 - (k1 + k2));
    p.offset = static_cast<float>((double(bg[mid]) + bg[key] + bg[low]) * (g - 1.0) / 3.0);
    p.shadowsGain = static_cast<float>(in.rangeGains[0]);
    p.midtonesGain = static_cast<float>(in.rangeGains[1]);
    p.highlightsGain = static_cast<float>(in.rangeGains[2]);
    p.tuning = in.rangeGains[0] != 1.0 || in.rangeGains[1] != 1.0 || in.rangeGains[2] != 1.0;
    const double most = std::max({v[0], v[1], v[2]}), least = std::min({v[0], v[1], v[2]});
    return most > least;
}

float DeltaKeyerDenominator(const DeltaKeyerScreenInfoParams &p) { return p.offset * p.oneMinusFactors + p.denomBase; }

void DeltaKeyerAdjustForClean(DeltaKeyerScreenInfoParams &p, const float clean[3]) {
    for (int c = 0; c < 3; ++c) p.background[c] = clean[c];
    const float k = clean[p.keyIndex], m = clean[p.midIndex], l = clean[p.lowIndex];
    p.denomBase = std::fabs(k - (m * p.midFactor + l * p.lowFactor));
    p.offset = (m + k + l) * (p.gain - 1.f) / 3.f;
}

float DeltaKeyerMatteValue(const DeltaKeyerScreenInfo &info, const float p[3]) { return MatteOf(info, p); }

// ---- steps ----

bool ProcessScreen(const DeltaKeyerRun &run, const Image *src, Image *dst, const Image *clean,
                   const DeltaKeyerScreenInfo &color, const DeltaKeyerScreenInfo &alpha, bool same) {
    if (!src || !dst) return false;
    auto fn = [&](const PixelsIn<2> &in, FltPixel *out, int n) {
        ScreenPixels(color, same ? color : alpha, same, in[0], in[1], out, n);
    };
    const Inputs<2> ins{src, clean};
    const FltPixel canvas = CanvasOf(ins, fn);
    auto block = NewBlock<DeltaKeyerScreenParams>();
    DeltaKeyerScreenParams &p = *block;
    p.colorInfo = color.p;
    p.alphaInfo = same ? color.p : alpha.p;
    const ColorCurvesTable *table = color.table ? color.table : alpha.table;
    const bool tuning = table && (p.colorInfo.tuning || p.alphaInfo.tuning);
    Ref<Image> tableImage = tuning && run.device ? TableImage(*table) : nullptr;
    if (tableImage) {
        p.ccSampleCount = p.ccTableWidth = ColorCurvesTable::kSamples;
        p.ccInvSampleHeight = 1.f;
    }
    p.sameInfo = same, p.doClean = clean != nullptr;
    Put(p.defaultP, src->GetCanvasColor());
    Put(p.defaultC, Canvas(clean));
    Window(p.srcWindow, src);
    Window(p.cleanWindow, clean);
    p.dstLeftBtm[0] = dst->DataWindow().x0, p.dstLeftBtm[1] = dst->DataWindow().y0;
    // This block gives the destination by its corner alone, so the run is set up here.
    if (run.device && run.req && !dst->DataWindow().IsNull() && (!tuning || tableImage)) {
        p.workSize[0] = dst->DataWindow().Width(), p.workSize[1] = dst->DataWindow().Height();
        Image *stand = const_cast<Image *>(src);
        if (KROMComputeNode::ExecKernelI(run.req, "DeltaKeyerScreen", nullptr, DeltaKeyerParamsText, sizeof p,
                                         offsetof(DeltaKeyerScreenParams, srcCompOrder),
                                         offsetof(DeltaKeyerScreenParams, dstCompOrder), block,
                                         {{"input", stand},
                                          {"clean", Arg(clean, src)},
                                          {"table", tableImage ? tableImage.Get() : stand},
                                          {"output", dst}})) {
            dst->SetCanvasColor(canvas);
            return true;
        }
    }
    return Rows(run, dst, ins, fn);
}

bool ProcessPreMatte(const DeltaKeyerRun &run, const Image *src, Image *dst, const DeltaKeyerPreMatteRanges &r) {
    if (!src || !dst) return false;
    auto fn = [&](const PixelsIn<1> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const float e = PreMatteValue(r, in[0][i]);
            out[i] = {e, e, e, e};
        }
    };
    const Inputs<1> ins{src};
    auto block = NewBlock<DeltaKeyerPreMatteParams>();
    Put(block->defaultP, src->GetCanvasColor());
    block->soft = r.soft;
    std::memcpy(block->lowRGBL, r.low, sizeof r.low);
    std::memcpy(block->highRGBL, r.high, sizeof r.high);
    Window(block->srcWindow, src);
    return Device(run, "DeltaKeyerPreMatte", block, dst, CanvasOf(ins, fn),
                  {{"input", const_cast<Image *>(src)}, {"output", dst}}) ||
           Rows(run, dst, ins, fn);
}

bool ProcessPreMatteCombine(const DeltaKeyerRun &run, const Image *src, Image *dst, const Image *preMatte,
                            const Image *clean, const float other[4]) {
    if (!src || !dst || !preMatte) return false;
    const FltPixel fallback{other[0], other[1], other[2], other[3]};
    auto fn = [&](const PixelsIn<3> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const FltPixel &s = in[0][i], &o = in[2] ? in[2][i] : fallback;
            const float a = in[1][i].A;
            out[i] = {s.R * a + o.R * (1.f - a), s.G * a + o.G * (1.f - a), s.B * a + o.B * (1.f - a), s.A};
        }
    };
    const Inputs<3> ins{src, preMatte, clean};
    auto block = NewBlock<DeltaKeyerPreMatteCombineParams>();
    DeltaKeyerPreMatteCombineParams &p = *block;
    Put(p.defaultP, src->GetCanvasColor());
    Put(p.defaultC, clean ? clean->GetCanvasColor() : fallback);
    p.defaultM = preMatte->GetCanvasColor().A;
    p.doClean = clean != nullptr;
    Window(p.srcWindow, src);
    Window(p.cleanWindow, clean);
    Window(p.matteWindow, preMatte);
    return Device(run, "DeltaKeyerPreMatteCombine", block, dst, CanvasOf(ins, fn),
                  {{"input", const_cast<Image *>(src)},
                   {"preMatte", const_cast<Image *>(preMatte)},
                   {"clean", Arg(clean, src)},
                   {"output", dst}}) ||
           Rows(run, dst, ins, fn);
}

bool ProcessThreshold(const DeltaKeyerRun &run, Image *img, float low, float high) {
    if (!img) return false;
    auto fn = [&](const PixelsIn<1> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            out[i] = in[0][i];
            out[i].A = ThresholdValue(out[i].A, low, high);
        }
    };
    const Inputs<1> ins{img};
    auto block = NewBlock<DeltaKeyerThresholdParams>();
    Put(block->defaultP, img->GetCanvasColor());
    block->thresholdLow = low, block->thresholdHigh = high;
    Window(block->srcWindow, img);
    return Device(run, "DeltaKeyerThreshold", block, img, CanvasOf(ins, fn), {{"input", img}, {"output", img}}) ||
           Rows(run, img, ins, fn);
}

bool ProcessRestoreFringe(const DeltaKeyerRun &run, const Image *soft, Image *img, const Image *eroded,
                          const Image *dilated, float defaultErode, float defaultDilate) {
    if (!soft || !img) return false;
    auto fn = [&](const PixelsIn<4> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const float ae = in[2] ? in[2][i].A : defaultErode, ad = in[3] ? in[3][i].A : defaultDilate;
            out[i] = in[0][i];
            out[i].A = FMax(ae, FMin(in[1][i].A, ad));
        }
    };
    const Inputs<4> ins{img, soft, eroded, dilated};
    auto block = NewBlock<DeltaKeyerRestoreFringeParams>();
    DeltaKeyerRestoreFringeParams &p = *block;
    p.isErode = eroded != nullptr, p.isDilate = dilated != nullptr;
    p.defaultErode = eroded ? eroded->GetCanvasColor().A : defaultErode;
    p.defaultDilate = dilated ? dilated->GetCanvasColor().A : defaultDilate;
    Put(p.defaultP, img->GetCanvasColor());
    p.defaultSoft = soft->GetCanvasColor().A;
    Window(p.srcWindow, img);
    Window(p.softWindow, soft);
    Window(p.erodeWindow, eroded);
    Window(p.dilateWindow, dilated);
    return Device(run, "DeltaKeyerRestoreFringe", block, img, CanvasOf(ins, fn),
                  {{"input", img},
                   {"soft", const_cast<Image *>(soft)},
                   {"eroded", Arg(eroded, soft)},
                   {"dilated", Arg(dilated, soft)},
                   {"output", img}}) ||
           Rows(run, img, ins, fn);
}

bool ProcessReplace(const DeltaKeyerRun &run, int mode, const Image *src, const Image *before, const Image *after,
                    Image *img, const float replace[3]) {
    if (!src || !before || !after || !img) return false;
    if (mode == DeltaKeyerReplaceNone) return true;
    auto fn = [&](const PixelsIn<4> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            out[i] = in[3][i];
            ReplacePixel(mode, in[0][i], in[1][i].A, in[2][i].A, replace, out[i]);
        }
    };
    const Inputs<4> ins{src, before, after, img};
    auto block = NewBlock<DeltaKeyerReplaceParams>();
    DeltaKeyerReplaceParams &p = *block;
    Put(p.sp, src->GetCanvasColor());
    Put(p.defaultF, img->GetCanvasColor());
    p.preMatte = before->GetCanvasColor().A, p.matte = after->GetCanvasColor().A;
    for (int c = 0; c < 3; ++c) p.replace[c] = replace[c];
    p.mode = mode;
    Window(p.srcWindow, src);
    Window(p.preWindow, before);
    Window(p.matteWindow, after);
    Window(p.colorWindow, img);
    return Device(run, "DeltaKeyerReplace", block, img, CanvasOf(ins, fn),
                  {{"source", const_cast<Image *>(src)},
                   {"before", const_cast<Image *>(before)},
                   {"after", const_cast<Image *>(after)},
                   {"input", img},
                   {"output", img}}) ||
           Rows(run, img, ins, fn);
}

bool ProcessReplaceMask(const DeltaKeyerRun &run, int mode, const Image *src, const Image *before, const Image *mask,
                        bool invertMask, Image *img, const float replace[3]) {
    if (!src || !before || !mask || !img) return false;
    if (mode == DeltaKeyerReplaceNone) return true;
    auto fn = [&](const PixelsIn<4> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            out[i] = in[3][i];
            const float s = invertMask ? 1.f - in[2][i].A : in[2][i].A;
            if (s > 0.f) ReplacePixel(mode, in[0][i], in[1][i].A, out[i].A, replace, out[i]);
        }
    };
    const Inputs<4> ins{src, before, mask, img};
    auto block = NewBlock<DeltaKeyerReplaceMaskParams>();
    DeltaKeyerReplaceMaskParams &p = *block;
    Put(p.sp, src->GetCanvasColor());
    Put(p.defaultF, img->GetCanvasColor());
    p.key = before->GetCanvasColor().A, p.mask = mask->GetCanvasColor().A;
    for (int c = 0; c < 3; ++c) p.colors[c] = replace[c];
    p.isInvert = invertMask, p.mode = mode;
    Window(p.srcWindow, src);
    Window(p.preWindow, before);
    Window(p.maskWindow, mask);
    Window(p.colorWindow, img);
    return Device(run, "DeltaKeyerReplaceMask", block, img, CanvasOf(ins, fn),
                  {{"source", const_cast<Image *>(src)},
                   {"before", const_cast<Image *>(before)},
                   {"mask", const_cast<Image *>(mask)},
                   {"input", img},
                   {"output", img}}) ||
           Rows(run, img, ins, fn);
}

bool ProcessMaskMerge(const DeltaKeyerRun &run, const Image *mask, Image *img, bool invert, bool invertMask) {
    if (!mask || !img) return false;
    auto fn = [&](const PixelsIn<2> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            out[i] = in[1][i];
            out[i].A = MergeValue(in[0][i].A, out[i].A, invert, invertMask);
        }
    };
    const Inputs<2> ins{mask, img};
    auto block = NewBlock<DeltaKeyerMaskMergeParams>();
    DeltaKeyerMaskMergeParams &p = *block;
    p.defaultS = mask->GetCanvasColor().A;
    Put(p.defaultD, img->GetCanvasColor());
    p.isInvert = invert, p.invertMask = invertMask;
    Window(p.maskWindow, mask);
    Window(p.srcWindow, img);
    return Device(run, "DeltaKeyerMaskMerge", block, img, CanvasOf(ins, fn),
                  {{"mask", const_cast<Image *>(mask)}, {"input", img}, {"output", img}}) ||
           Rows(run, img, ins, fn);
}

bool ProcessColorMax(const DeltaKeyerRun &run, const Image *key, Image *img) {
    if (!img) return false;
    auto fn = [&](const PixelsIn<2> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const float k = in[0] ? in[0][i].A : 0.f;
            FltPixel &d = out[i] = in[1][i];
            d.A = Clamp01(FMax(FMax(d.A, k), FMax(d.R, FMax(d.G, d.B))));
        }
    };
    const Inputs<2> ins{key, img};
    auto block = NewBlock<DeltaKeyerColorMaxParams>();
    DeltaKeyerColorMaxParams &p = *block;
    Put(p.defaultP, img->GetCanvasColor());
    p.isKey = key != nullptr;
    p.defaultKey = key ? key->GetCanvasColor().A : 0.f;
    Window(p.srcWindow, img);
    Window(p.keyWindow, key);
    return Device(run, "DeltaKeyerColorMax", block, img, CanvasOf(ins, fn),
                  {{"key", Arg(key, img)}, {"input", img}, {"output", img}}) ||
           Rows(run, img, ins, fn);
}

bool ProcessRangesToColor(const DeltaKeyerRun &run, const Image *src, Image *dst, const ColorCurvesTable &table) {
    if (!src || !dst) return false;
    auto fn = [&](const PixelsIn<1> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const FltPixel &s = in[0][i];
            float w[3];
            table.WeightsAt(FMax(FMax(s.R, s.G), s.B), w[0], w[1], w[2]);
            out[i] = {w[0], w[1], w[2], 1.f};
        }
    };
    const Inputs<1> ins{src};
    Ref<Image> tableImage = run.device ? TableImage(table) : nullptr;
    auto block = NewBlock<DeltaKeyerRangesToColorParams>();
    DeltaKeyerRangesToColorParams &p = *block;
    Put(p.defaultP, src->GetCanvasColor());
    p.ccSampleCount = p.ccTableWidth = ColorCurvesTable::kSamples;
    p.ccInvSampleHeight = 1.f;
    p.maxChannels = 3;
    Window(p.srcWindow, src);
    return (tableImage &&
            Device(run, "DeltaKeyerRangesToColor", block, dst, CanvasOf(ins, fn),
                   {{"input", const_cast<Image *>(src)}, {"table", tableImage.Get()}, {"output", dst}})) ||
           Rows(run, dst, ins, fn);
}

bool ProcessAlphaToColor(const DeltaKeyerRun &run, const Image *src, Image *dst, bool invert) {
    if (!src || !dst) return false;
    auto fn = [&](const PixelsIn<1> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const float a = in[0][i].A, v = invert ? 1.f - a : a;
            out[i] = {v, v, v, a};
        }
    };
    const Inputs<1> ins{src};
    auto block = NewBlock<DeltaKeyerAlphaToColorParams>();
    block->alpha = src->GetCanvasColor().A, block->isInvert = invert;
    Window(block->srcWindow, src);
    return Device(run, "DeltaKeyerAlphaToColor", block, dst, CanvasOf(ins, fn),
                  {{"input", const_cast<Image *>(src)}, {"output", dst}}) ||
           Rows(run, dst, ins, fn);
}

bool ProcessCopyColor(const DeltaKeyerRun &run, const Image *src, Image *dst) {
    if (!src || !dst) return false;
    auto fn = [&](const PixelsIn<2> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) out[i] = {in[0][i].R, in[0][i].G, in[0][i].B, in[1][i].A};
    };
    const Inputs<2> ins{src, dst};
    auto block = NewBlock<DeltaKeyerCopyColorParams>();
    Put(block->defaultP, src->GetCanvasColor());
    Put(block->defaultD, dst->GetCanvasColor());
    Window(block->srcWindow, src);
    Window(block->colorWindow, dst);
    return Device(run, "DeltaKeyerCopyColor", block, dst, CanvasOf(ins, fn),
                  {{"source", const_cast<Image *>(src)}, {"input", dst}, {"output", dst}}) ||
           Rows(run, dst, ins, fn);
}

bool ProcessSourceAlpha(const DeltaKeyerRun &run, const Image *src, Image *dst, int mode) {
    if (!src || !dst) return false;
    const bool show = mode == DeltaKeyerSourceAlphaShow;
    auto fn = [&](const PixelsIn<2> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const float a = in[0][i].A, k = 1.f - a;
            const FltPixel &d = in[1][i];
            out[i] = show ? FltPixel{a, a, a, 1.f} : FltPixel{d.R * k, d.G * k, d.B * k, d.A * k};
        }
    };
    const Inputs<2> ins{src, dst};
    auto block = NewBlock<DeltaKeyerSourceAlphaParams>();
    block->alpha = src->GetCanvasColor().A, block->mode = show ? 0 : 1;
    Put(block->defaultD, dst->GetCanvasColor());
    Window(block->srcWindow, src);
    Window(block->colorWindow, dst);
    return Device(run, "DeltaKeyerSourceAlpha", block, dst, CanvasOf(ins, fn),
                  {{"source", const_cast<Image *>(src)}, {"input", dst}, {"output", dst}}) ||
           Rows(run, dst, ins, fn);
}

bool ProcessStatusDiff(const DeltaKeyerRun &run, const Image *before, const Image *after, Image *diff) {
    if (!before || !after || !diff) return false;
    auto fn = [&](const PixelsIn<2> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const float d = in[1][i].A - in[0][i].A;
            out[i] = {d, d, d, d};
        }
    };
    const Inputs<2> ins{before, after};
    auto block = NewBlock<DeltaKeyerStatusDiffParams>();
    block->preMatte = before->GetCanvasColor().A, block->matte = after->GetCanvasColor().A;
    Window(block->preWindow, before);
    Window(block->matteWindow, after);
    return Device(run, "DeltaKeyerStatusDiff", block, diff, CanvasOf(ins, fn),
                  {{"before", const_cast<Image *>(before)}, {"after", const_cast<Image *>(after)}, {"output", diff}}) ||
           Rows(run, diff, ins, fn);
}

bool ProcessStatus(const DeltaKeyerRun &run, Image *img, const Image *diff, bool invert) {
    if (!img) return false;
    auto fn = [&](const PixelsIn<2> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            const float a = in[0][i].A, g = StatusLevel(invert ? 1.f - a : a);
            out[i] = {g, g, g, a};
            const float w = in[1] ? in[1][i].A : 0.f;
            if (w >= kStatusClear) Tint(out[i], 1.f, 1.f, 0.f);
            if (w <= -kStatusClear) Tint(out[i], 0.f, 0.f, 1.f);
        }
    };
    const Inputs<2> ins{img, diff};
    auto block = NewBlock<DeltaKeyerStatusParams>();
    Put(block->defaultP, img->GetCanvasColor());
    block->isDiff = diff != nullptr, block->isInvert = invert;
    block->diff = diff ? diff->GetCanvasColor().A : 0.f;
    Window(block->srcWindow, img);
    Window(block->diffWindow, diff);
    return Device(run, "DeltaKeyerStatus", block, img, CanvasOf(ins, fn),
                  {{"input", img}, {"diff", Arg(diff, img)}, {"output", img}}) ||
           Rows(run, img, ins, fn);
}

/// The solid (adds m (1 - a), green) and garbage (takes m a, red) tints.
template <class P>
bool StatusMask(const DeltaKeyerRun &run, const char *kernel, bool solid, Image *img, const Image *mask, bool invert) {
    if (!img || !mask) return false;
    auto fn = [&](const PixelsIn<2> &in, FltPixel *out, int n) {
        for (int i = 0; i < n; ++i) {
            out[i] = in[0][i];
            const float m = invert ? 1.f - in[1][i].A : in[1][i].A;
            if (m * (solid ? 1.f - out[i].A : out[i].A) >= kStatusClear)
                Tint(out[i], solid ? 0.f : 1.f, solid ? 1.f : 0.f, 0.f);
        }
    };
    const Inputs<2> ins{img, mask};
    auto block = NewBlock<P>();
    Put(block->defaultP, img->GetCanvasColor());
    block->isInvert = invert, block->mask = mask->GetCanvasColor().A;
    Window(block->srcWindow, img);
    Window(block->maskWindow, mask);
    return Device(run, kernel, block, img, CanvasOf(ins, fn),
                  {{"input", img}, {"mask", const_cast<Image *>(mask)}, {"output", img}}) ||
           Rows(run, img, ins, fn);
}

bool ProcessStatusSolid(const DeltaKeyerRun &run, Image *img, const Image *mask, bool invert) {
    return StatusMask<DeltaKeyerStatusSolidParams>(run, "DeltaKeyerStatusSolid", true, img, mask, invert);
}

bool ProcessStatusGarbage(const DeltaKeyerRun &run, Image *img, const Image *mask, bool invert) {
    return StatusMask<DeltaKeyerStatusGarbageParams>(run, "DeltaKeyerStatusGarbage", false, img, mask, invert);
}

} // namespace Orvane
