#include "host/image/Resample.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <new>
#include <vector>

#include "host/core/Parallel.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {
namespace resample {

/// Weights below this fraction of a sample's largest weight count as zero:
/// what an interpolating filter gives at whole distances (sin(pi k) in double
/// is about 1e-16, not 0).
constexpr double kZeroWeight = 1e-9;
/// The largest table (weights) an axis may have: a shrink to a few pixels
/// with a wide filter stays well below it.
constexpr size_t kMaxTableWeights = size_t(1) << 26;
/// Output rows below which a job is not split further. Each run filters the
/// first rows it needs afresh, so runs stay long: two per worker suffice, as
/// every row costs the same.
constexpr int kMinRowsPerRun = 32;

/// The weights of source samples lo .. lo + w.size() - 1 for the output
/// sample at source position u (before trimming and normalising).
void RawWeights(const ResampleSpec &s, double u, int &lo, std::vector<double> &w) {
    w.clear();
    const bool clip = s.edges == EdgeRenormalise;
    if (s.filter == RszNearest) {
        lo = static_cast<int>(std::floor(u));
        if (clip) lo = std::clamp(lo, s.srcLo, s.srcHi - 1);
        w.push_back(1.0);
        return;
    }
    const double stretch = std::max(1.0, 1.0 / s.scale);
    if (s.filter == RszBox) {
        const double r = 0.5 * stretch;
        double a = u - r, b = u + r;
        if (clip) {
            a = std::max(a, static_cast<double>(s.srcLo));
            b = std::min(b, static_cast<double>(s.srcHi));
            if (b <= a) { // the whole footprint beyond the range: the nearest end pixel
                lo = u < s.srcLo ? s.srcLo : s.srcHi - 1;
                w.push_back(1.0);
                return;
            }
        }
        lo = static_cast<int>(std::floor(a));
        const int hi = static_cast<int>(std::ceil(b));
        for (int j = lo; j < hi; ++j) w.push_back(std::max(0.0, std::min(b, j + 1.0) - std::max(a, 1.0 * j)));
        return;
    }
    const double support = ResizeFilterSupport(s.filter);
    const double radius = support * stretch;
    int j0 = static_cast<int>(std::ceil(u - radius - 0.5));
    int j1 = static_cast<int>(std::floor(u + radius - 0.5));
    if (clip) j0 = std::max(j0, s.srcLo), j1 = std::min(j1, s.srcHi - 1);
    lo = j0;
    for (int j = j0; j <= j1; ++j) w.push_back(ResizeFilterValue(s.filter, s.window, (j + 0.5 - u) / stretch));
}

} // namespace resample

bool ResampleAxis::Build(const ResampleSpec &spec, int outStart, int outCount) {
    spec_ = spec;
    valid_ = false;
    start_ = outStart;
    taps_ = 0;
    first_.clear(), weights_.clear();
    if (!(spec.scale > 0.0) || !std::isfinite(spec.scale) || !std::isfinite(spec.offset) || spec.srcHi <= spec.srcLo ||
        outCount < 0)
        return false;
    spec_.filter = ValidResizeFilter(spec.filter);
    spec_.window =
        spec_.filter == RszSinc || spec_.filter == RszBessel ? ValidResizeWindow(spec.window) : RszWindowHanning;
    // Positions far beyond any image would overflow the indices.
    const double reach = ResizeFilterSupport(spec_.filter) * std::max(1.0, 1.0 / spec.scale) + 2.0;
    for (double o : {double(outStart), double(outStart) + outCount}) {
        const double u = (o + 0.5 - spec.offset) / spec.scale;
        if (!(std::fabs(u) + reach < 1e9)) return false;
    }

    // Trimmed, normalised runs first; then every run padded to one even length.
    std::vector<int> first(outCount), count(outCount);
    std::vector<double> all;
    std::vector<double> w;
    int maxTaps = 1;
    for (int i = 0; i < outCount; ++i) {
        const double u = (outStart + i + 0.5 - spec_.offset) / spec_.scale;
        int lo = 0;
        resample::RawWeights(spec_, u, lo, w);
        double peak = 0.0;
        for (double v : w) peak = std::max(peak, std::fabs(v));
        for (double &v : w)
            if (std::fabs(v) < resample::kZeroWeight * peak) v = 0.0;
        size_t b = 0, e = w.size();
        while (b < e && w[b] == 0.0) ++b;
        while (e > b && w[e - 1] == 0.0) --e;
        double sum = 0.0;
        for (size_t k = b; k < e; ++k) sum += w[k];
        if (b == e || std::fabs(sum) < 1e-12) { // nothing usable: the pixel under u
            int j = static_cast<int>(std::floor(u));
            if (spec_.edges == EdgeRenormalise) j = std::clamp(j, spec_.srcLo, spec_.srcHi - 1);
            first[i] = j, count[i] = 1;
            all.push_back(1.0);
        } else {
            first[i] = lo + static_cast<int>(b), count[i] = static_cast<int>(e - b);
            for (size_t k = b; k < e; ++k) all.push_back(w[k] / sum);
        }
        maxTaps = std::max(maxTaps, count[i]);
        if (all.size() > resample::kMaxTableWeights) return false;
    }
    taps_ = (maxTaps + 1) & ~1;
    if (static_cast<size_t>(taps_) * outCount > resample::kMaxTableWeights) return false;
    first_ = std::move(first);
    weights_.assign(static_cast<size_t>(taps_) * outCount, 0.f);
    size_t at = 0;
    for (int i = 0; i < outCount; ++i)
        for (int k = 0; k < count[i]; ++k) weights_[static_cast<size_t>(i) * taps_ + k] = static_cast<float>(all[at++]);
    valid_ = true;
    return true;
}

void ResampleAxis::SourceSpan(int begin, int end, int &lo, int &hi) const {
    lo = hi = 0;
    bool any = false;
    for (int o = std::max(begin, start_); o < std::min(end, start_ + Count()); ++o) {
        const int f = first_[o - start_];
        lo = any ? std::min(lo, f) : f;
        hi = any ? std::max(hi, f + taps_) : f + taps_;
        any = true;
    }
}

// ---- the row job ----
//
// The sums below are the ones the device kernels repeat (ResizeKernels.cpp);
// contraction into fused multiply-adds would change their bits, so it is off
// for this part, also in the clone for processors that have it.
#if defined(__clang__)
#pragma float_control(push)
#pragma clang fp contract(off)
#else
#pragma GCC push_options
#pragma GCC optimize("fp-contract=off")
#endif

namespace resample {

// Eight floats, and four, as the processor's vectors (two SSE registers or one
// AVX register for eight). *At8(p) is the eight floats at p as a vector
// (unaligned, aliasing the floats). At8 returns a pointer: no vector passes
// by value between a clone and a helper built for another processor, and the
// pointer keeps the unaligned type (a returned reference loses it in Clang).
typedef float V8 __attribute__((vector_size(32)));
typedef float V4 __attribute__((vector_size(16)));
typedef float V8Unaligned __attribute__((vector_size(32), aligned(4), may_alias));
inline const V8Unaligned *At8(const float *p) { return reinterpret_cast<const V8Unaligned *>(p); }
inline V8Unaligned *At8(float *p) { return reinterpret_cast<V8Unaligned *>(p); }

/// Across, four channels: out pixel i = sum over taps of w * pixel, the even
/// taps and the odd taps summed apart and added last. `w4` holds each weight
/// four times (one per channel), `taps` even; `src` is pixel `origin`.
__attribute__((target_clones("arch=x86-64-v3", "default"))) void
AcrossRGBA(const float *src, int origin, const int *first, const float *w4, int taps, int count, float *out) {
    const int n = 4 * taps;
    for (int i = 0; i < count; ++i) {
        const float *s = src + 4 * (first[i] - origin);
        const float *w = w4 + static_cast<size_t>(i) * n;
        V8 a = {0, 0, 0, 0, 0, 0, 0, 0};
        for (int k = 0; k < n; k += 8) a += *At8(w + k) * *At8(s + k);
        const V4 even = {a[0], a[1], a[2], a[3]}, odd = {a[4], a[5], a[6], a[7]};
        const V4 sum = even + odd;
        std::memcpy(out + 4 * i, &sum, sizeof sum);
    }
}

/// AcrossRGBA on two rows at once, sharing the weights' loads.
__attribute__((target_clones("arch=x86-64-v3", "default"))) void AcrossRGBA2(const float *src0, const float *src1,
                                                                             int origin, const int *first,
                                                                             const float *w4, int taps, int count,
                                                                             float *out0, float *out1) {
    const int n = 4 * taps;
    for (int i = 0; i < count; ++i) {
        const size_t at = static_cast<size_t>(4) * (first[i] - origin);
        const float *s0 = src0 + at, *s1 = src1 + at;
        const float *w = w4 + static_cast<size_t>(i) * n;
        V8 a = {0, 0, 0, 0, 0, 0, 0, 0}, b = a;
        for (int k = 0; k < n; k += 8) {
            const V8 wk = *At8(w + k);
            a += wk * *At8(s0 + k);
            b += wk * *At8(s1 + k);
        }
        const V4 sa = V4{a[0], a[1], a[2], a[3]} + V4{a[4], a[5], a[6], a[7]};
        const V4 sb = V4{b[0], b[1], b[2], b[3]} + V4{b[4], b[5], b[6], b[7]};
        std::memcpy(out0 + 4 * i, &sa, sizeof sa);
        std::memcpy(out1 + 4 * i, &sb, sizeof sb);
    }
}

/// Across, one channel, in the same order.
void AcrossMask(const float *src, int origin, const int *first, const float *w, int taps, int count, float *out) {
    for (int i = 0; i < count; ++i) {
        const float *s = src + (first[i] - origin);
        const float *wi = w + static_cast<size_t>(i) * taps;
        float even = 0.f, odd = 0.f;
        for (int k = 0; k < taps; k += 2) {
            even += wi[k] * s[k];
            odd += wi[k + 1] * s[k + 1];
        }
        out[i] = even + odd;
    }
}

/// Down: out[x] = sum over k in order of w[k] * rows[k][x].
__attribute__((target_clones("arch=x86-64-v3", "default"))) void Down(const float *const *rows, const float *w,
                                                                      int taps, int len, float *out) {
    // Blocks of 64 floats: eight sums stay in registers across the taps.
    int x0 = 0;
    for (; x0 + 64 <= len; x0 += 64) {
        V8 a0 = {}, a1 = {}, a2 = {}, a3 = {}, a4 = {}, a5 = {}, a6 = {}, a7 = {};
        for (int k = 0; k < taps; ++k) {
            const V8 wk = {w[k], w[k], w[k], w[k], w[k], w[k], w[k], w[k]};
            const float *r = rows[k] + x0;
            a0 += wk * *At8(r), a1 += wk * *At8(r + 8), a2 += wk * *At8(r + 16), a3 += wk * *At8(r + 24);
            a4 += wk * *At8(r + 32), a5 += wk * *At8(r + 40), a6 += wk * *At8(r + 48), a7 += wk * *At8(r + 56);
        }
        float *o = out + x0;
        *At8(o) = a0, *At8(o + 8) = a1, *At8(o + 16) = a2, *At8(o + 24) = a3;
        *At8(o + 32) = a4, *At8(o + 40) = a5, *At8(o + 48) = a6, *At8(o + 56) = a7;
    }
    for (; x0 + 8 <= len; x0 += 8) {
        V8 a = {};
        for (int k = 0; k < taps; ++k) a += w[k] * *At8(rows[k] + x0);
        *At8(out + x0) = a;
    }
    for (int x = x0; x < len; ++x) {
        float acc = 0.f;
        for (int k = 0; k < taps; ++k) acc += w[k] * rows[k][x];
        out[x] = acc;
    }
}

} // namespace resample

#if defined(__clang__)
#pragma float_control(pop)
#else
#pragma GCC pop_options
#endif

namespace resample {

/// What all runs of one job share.
struct Job {
    const Image &src;
    Image &dst;
    const ResampleAxis &ax, &ay;
    ImgRectI dw;
    int width = 0;
    int channels = 4; ///< 1 when both images are masks
    FltPixel canvas;
    // Across: the output columns' first source index, the expanded weights,
    // and the source columns they read, [xs0, xs1).
    std::vector<int> first;
    std::vector<float> wx;
    int tx = 0, xs0 = 0, xs1 = 0;
    // The part of every source row that can be read in place (RGBA float
    // sources): the columns inside both the range and the data window, and
    // the output columns [iL, iR) whose taps all fall in it.
    bool direct = false;
    int dx0 = 0, dx1 = 0, iL = 0, iR = 0;
    std::vector<float> canvasRow; ///< a row of canvas, filtered across

    Job(const Image &s, Image &d, const ResampleAxis &x, const ResampleAxis &y) : src(s), dst(d), ax(x), ay(y) {}
};

/// A source position's sample under an axis's edge policy: the index to read,
/// or false where the canvas colour lies.
bool MapIndex(const ResampleSpec &s, int i, int &out) {
    if (s.edges == EdgeRenormalise || (i >= s.srcLo && i < s.srcHi)) {
        out = i;
        return true;
    }
    out = MapEdge(i, s.srcLo, s.srcHi, s.edges);
    return out >= s.srcLo;
}

/// Source row `sy` (mapped, inside the y range) across columns [x0, x1) as
/// FltPixels, the x edge policy applied beyond the x range.
void ReadPadded(const Job &job, int sy, int x0, int x1, FltPixel *out) {
    const ResampleSpec &sx = job.ax.Spec();
    const int in0 = std::clamp(sx.srcLo, x0, x1), in1 = std::clamp(sx.srcHi, in0, x1);
    if (in1 > in0) ReadSpanFlt(job.src, sy, in0, in1, out + (in0 - x0));
    for (int x = x0; x < x1; ++x) {
        if (x >= in0 && x < in1) {
            x = in1 - 1;
            continue;
        }
        int m = 0;
        if (MapIndex(sx, x, m))
            ReadSpanFlt(job.src, sy, m, m + 1, out + (x - x0));
        else
            out[x - x0] = job.canvas;
    }
}

/// One worker's scratch: the padded source row, and a ring of rows filtered
/// across, keyed by source row.
struct Run {
    const Job &job;
    std::vector<FltPixel> padded;
    std::vector<float> flat; // masks: one channel of `padded`
    std::vector<float> ring;
    std::vector<int> ringRow;
    int slots = 0;
    size_t rowFloats = 0;

    explicit Run(const Job &j) : job(j) {
        rowFloats = static_cast<size_t>(j.width) * j.channels;
        slots = j.ay.Taps() + 2;
        ring.resize(rowFloats * slots);
        ringRow.assign(slots, INT32_MIN);
    }

    /// The row filtered across from an all-canvas source row.
    void AcrossCanvas(float *out) {
        padded.assign(static_cast<size_t>(job.xs1 - job.xs0), job.canvas);
        Across(padded.data(), out, 0, job.width);
    }

    /// Filters output columns [i0, i1) from FltPixels of source columns from xs0.
    void Across(const FltPixel *row, float *out, int i0, int i1) {
        if (i1 <= i0) return;
        if (job.channels == 4) {
            AcrossRGBA(&row->R, job.xs0, job.first.data() + i0, job.wx.data() + static_cast<size_t>(i0) * 4 * job.tx,
                       job.tx, i1 - i0, out + 4 * i0);
            return;
        }
        flat.resize(padded.size());
        for (size_t k = 0; k < flat.size(); ++k) flat[k] = row[k].A;
        AcrossMask(flat.data(), job.xs0, job.first.data() + i0, job.wx.data() + static_cast<size_t>(i0) * job.tx,
                   job.tx, i1 - i0, out + i0);
    }

    float *Slot(int s) { return ring.data() + rowFloats * (((s % slots) + slots) % slots); }
    bool Has(int s) const { return ringRow[((s % slots) + slots) % slots] == s; }

    /// The source row (inside the range and the data window) that ring row
    /// `s` reads in place, or -1 when it has to be read through a copy.
    int DirectRow(int s) const {
        int sy = 0;
        const ImgRectI &sw = job.src.DataWindow();
        return job.direct && MapIndex(job.ay.Spec(), s, sy) && sy >= sw.y0 && sy < sw.y1 ? sy : -1;
    }

    /// The ends of a row read in place: the output columns whose taps need the edge policy.
    void DirectEnds(int sy, float *out) {
        padded.resize(static_cast<size_t>(job.xs1 - job.xs0));
        int lo = 0, hi = 0;
        if (job.iL > 0) {
            job.ax.SourceSpan(job.dw.x0, job.dw.x0 + job.iL, lo, hi);
            ReadPadded(job, sy, lo, hi, padded.data() + (lo - job.xs0));
            Across(padded.data(), out, 0, job.iL);
        }
        if (job.iR < job.width) {
            job.ax.SourceSpan(job.dw.x0 + job.iR, job.dw.x1, lo, hi);
            ReadPadded(job, sy, lo, hi, padded.data() + (lo - job.xs0));
            Across(padded.data(), out, job.iR, job.width);
        }
    }

    /// Makes ring rows [s0, s1) present; two rows read in place go through
    /// the filter together.
    void Fill(int s0, int s1) {
        for (int s = s0; s < s1; ++s) {
            if (Has(s)) continue;
            const int a = DirectRow(s), b = s + 1 < s1 && !Has(s + 1) ? DirectRow(s + 1) : -1;
            if (a < 0 || b < 0) {
                Row(s);
                continue;
            }
            float *outA = Slot(s), *outB = Slot(s + 1);
            ringRow[((s % slots) + slots) % slots] = s;
            ringRow[(((s + 1) % slots) + slots) % slots] = s + 1;
            const size_t skip = static_cast<size_t>(job.iL);
            AcrossRGBA2(reinterpret_cast<const float *>(job.src.PixelAddress(job.dx0, a)),
                        reinterpret_cast<const float *>(job.src.PixelAddress(job.dx0, b)), job.dx0,
                        job.first.data() + skip, job.wx.data() + skip * 4 * job.tx, job.tx, job.iR - job.iL,
                        outA + 4 * skip, outB + 4 * skip);
            DirectEnds(a, outA);
            DirectEnds(b, outB);
            ++s;
        }
    }

    /// Source row `s` (before the y edge policy), filtered across.
    const float *Row(int s) {
        float *out = Slot(s);
        if (Has(s)) return out;
        ringRow[((s % slots) + slots) % slots] = s;
        int sy = 0;
        if (!MapIndex(job.ay.Spec(), s, sy)) {
            std::memcpy(out, job.canvasRow.data(), rowFloats * sizeof(float));
            return out;
        }
        if (DirectRow(s) >= 0) {
            // The middle in place; the ends from a padded copy of their columns only.
            const auto *pixels = reinterpret_cast<const float *>(job.src.PixelAddress(job.dx0, sy));
            AcrossRGBA(pixels, job.dx0, job.first.data() + job.iL,
                       job.wx.data() + static_cast<size_t>(job.iL) * 4 * job.tx, job.tx, job.iR - job.iL,
                       out + 4 * job.iL);
            DirectEnds(sy, out);
            return out;
        }
        padded.resize(static_cast<size_t>(job.xs1 - job.xs0));
        ReadPadded(job, sy, job.xs0, job.xs1, padded.data());
        Across(padded.data(), out, 0, job.width);
        return out;
    }
};

} // namespace resample

bool ResampleImage(const Image &src, Image &dst, const ResampleAxis &ax, const ResampleAxis &ay,
                   const std::atomic<bool> *abort, bool threaded) {
    dst.SetCanvasColor(src.GetCanvasColor());
    const ImgRectI dw = dst.DataWindow();
    if (dst.IsNoData() || dw.IsNull()) return true;
    if (!ax.IsValid() || !ay.IsValid() || !ax.Covers(dw.x0, dw.x1) || !ay.Covers(dw.y0, dw.y1)) return false;
    if (!src.DownloadGPUMem() || !dst.AllocScanLineData()) return false;

    resample::Job job(src, dst, ax, ay);
    job.dw = dw;
    job.width = dw.Width();
    job.channels = src.IsMask() && dst.IsMask() ? 1 : 4;
    job.canvas = src.GetCanvasColor();
    job.tx = ax.Taps();
    ax.SourceSpan(dw.x0, dw.x1, job.xs0, job.xs1);
    try {
        job.first.resize(job.width);
        job.wx.resize(static_cast<size_t>(job.width) * job.tx * job.channels);
        for (int i = 0; i < job.width; ++i) {
            const int o = dw.x0 + i - ax.Start();
            job.first[i] = ax.First(o);
            const float *w = ax.Weights(o);
            float *to = job.wx.data() + static_cast<size_t>(i) * job.tx * job.channels;
            for (int k = 0; k < job.tx; ++k)
                for (int c = 0; c < job.channels; ++c) to[k * job.channels + c] = w[k];
        }
        // Reading in place: RGBA float sources, over the columns that need no edge policy.
        const ImgRectI &sw = src.DataWindow();
        const ResampleSpec &sx = ax.Spec();
        job.dx0 = std::max(sx.srcLo, sw.x0), job.dx1 = std::min(sx.srcHi, sw.x1);
        if (src.Depth() == DepthRGBAFlt32 && job.channels == 4 && src.HasScanLineData() && job.dx1 > job.dx0) {
            auto inside = [&](int i) { return job.first[i] >= job.dx0 && job.first[i] + job.tx <= job.dx1; };
            int i = 0;
            while (i < job.width && !inside(i)) ++i;
            job.iL = i;
            while (i < job.width && inside(i)) ++i;
            job.iR = i;
            bool rest = false;
            for (; i < job.width && !rest; ++i) rest = inside(i);
            job.direct = job.iR > job.iL && !rest;
        }
        job.canvasRow.resize(static_cast<size_t>(job.width) * job.channels);
        resample::Run(job).AcrossCanvas(job.canvasRow.data());
    } catch (const std::bad_alloc &) {
        return false;
    }

    std::atomic<bool> failed{false};
    auto stop = [&] {
        if ((abort && abort->load(std::memory_order_relaxed)) || src.CheckAbort() || dst.CheckAbort())
            failed.store(true, std::memory_order_relaxed);
        return failed.load(std::memory_order_relaxed);
    };
    const bool directOut = dst.Depth() == DepthRGBAFlt32 && job.channels == 4;
    const int ty = ay.Taps();
    auto rows = [&](int y0, int y1) {
        try {
            resample::Run run(job);
            std::vector<const float *> taps(ty);
            std::vector<float> down(directOut ? 0 : run.rowFloats);
            std::vector<FltPixel> pixels(directOut || job.channels == 4 ? 0 : job.width);
            for (int y = y0; y < y1; ++y) {
                if (stop()) return;
                const int o = y - ay.Start();
                run.Fill(ay.First(o), ay.First(o) + ty);
                for (int k = 0; k < ty; ++k) taps[k] = run.Row(ay.First(o) + k);
                float *out = directOut ? dst.Row<float>(y) : down.data();
                resample::Down(taps.data(), ay.Weights(o), ty, static_cast<int>(run.rowFloats), out);
                if (directOut) continue;
                if (job.channels == 4) {
                    StoreFlt(dst.Depth(), reinterpret_cast<const FltPixel *>(out), job.width, dst.ScanLine(y));
                } else {
                    for (int x = 0; x < job.width; ++x) pixels[x].A = out[x];
                    StoreFlt(dst.Depth(), pixels.data(), job.width, dst.ScanLine(y));
                }
            }
        } catch (const std::bad_alloc &) {
            failed.store(true, std::memory_order_relaxed);
        }
    };
    const int total = dw.Height();
    const int runs = threaded ? std::clamp(total / resample::kMinRowsPerRun, 1, 2 * WorkerCount()) : 1;
    if (runs <= 1) {
        rows(dw.y0, dw.y1);
    } else {
        ParallelFor(runs, [&](int r) {
            rows(dw.y0 + static_cast<int>(static_cast<long long>(total) * r / runs),
                 dw.y0 + static_cast<int>(static_cast<long long>(total) * (r + 1) / runs));
        });
    }
    return !failed.load();
}

} // namespace Orvane
