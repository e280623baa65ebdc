// Image::BlurTagList, BlurOfImageTagList and GetBlurSupport: separable blurs
// over the kernels of BlurFilters.h (docs/BLUR.md).
//
// The source as the blur sees it: this image's pixels inside its data window
// and the source window (BlurSourceWindow), its canvas colour everywhere else,
// out to infinity. The blur runs across (X) and then down (Y):
//
//  1. Across. Rows of the source that hold pixels and that the second pass
//     needs are blurred across into a float RGBA buffer covering the output's
//     columns. Other rows of that buffer would be the canvas colour, and are
//     read as such.
//  2. Down. The buffer's columns are blurred into the output's rows, then
//     scaled, mixed with the source by blend and channel switches, and stored
//     in the output's depth (integers round and clamp).
//
// Both passes work on strips: eight rows (or eight columns) side by side, one
// sample of a strip being the 32 floats of eight RGBA pixels at one position
// along the line. The rows of a strip are interleaved into it (a small
// transpose), so every kind runs along contiguous samples with 32 independent
// lanes: direct convolution as 8-wide multiply-adds, running boxes and
// recursions with their sums in double. Strips are independent and run on the
// worker pool; each is computed the same way whatever thread takes it, so the
// result does not depend on the thread count.
//
// Masks (a one-channel source and destination): only the value (alpha)
// reaches the output, so a strip is 32 rows (or columns) of that one channel,
// the buffer holds one float per pixel, rows are read and stored at their
// depth once, and 8 x 8 block transposes move values between rows and strips.
// Each lane sees the same arithmetic as the alpha lane of the four-channel
// strips, so the results are the same bits.
//
// In place (dest == this): the first pass reads every source pixel it needs
// before the second writes any, and the second reads a pixel's own source
// value (for the mix) just before writing it.
//
// With WorkUseGPU and a render task that has a device, the finite kinds run
// as two kernels of the common library ("BlurRows", "BlurColumns") with the
// axis responses as weight tables; a failure leaves the work to the rows.
#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <vector>

#if defined(__x86_64__)
#include <immintrin.h>
#endif

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/image/PixelMemory.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/BlurKernelParams.h"

namespace Orvane {
namespace imgblur {

constexpr int kStrip = 8;          ///< pixels side by side in a strip
constexpr int kLanes = 4 * kStrip; ///< floats in one sample of a strip

using V8 = float __attribute__((vector_size(32)));

/// The request, read from the tags.
struct Settings {
    int type = BlurSoften;
    bool on[4] = {true, true, true, true};
    double x = 0.0, y = 0.0;
    float blend = 1.f;
    float scale[4] = {1.f, 1.f, 1.f, 1.f};
    int passes = 0;
    const ImgRectI *sourceWindow = nullptr;
    bool threaded = true, useGPU = false;
    Request *req = nullptr;

    explicit Settings(const TagList &tags) {
        type = ValidBlurType(static_cast<int>(tags.GetLong(BlurFilterType, BlurSoften)));
        const Tag doTags[4] = {BlurDoRed, BlurDoGreen, BlurDoBlue, BlurDoAlpha};
        const Tag scaleTags[4] = {BlurRedScale, BlurGreenScale, BlurBlueScale, BlurAlphaScale};
        const double all = tags.GetDouble(BlurScale, 1.0);
        for (int c = 0; c < 4; ++c) {
            on[c] = tags.GetBool(doTags[c], true);
            scale[c] = static_cast<float>(all * tags.GetDouble(scaleTags[c], 1.0));
        }
        x = tags.GetDouble(BlurXSize, 0.0);
        y = tags.GetDouble(BlurYSize, 0.0);
        blend = static_cast<float>(tags.GetDouble(BlurBlend, 1.0));
        passes = static_cast<int>(tags.GetLong(BlurPasses, 0));
        sourceWindow = tags.GetPtrAs<const ImgRectI>(BlurSourceWindow);
        threaded = tags.GetBool(WorkThreaded, true);
        useGPU = tags.GetBool(WorkUseGPU, false);
        req = tags.GetPtrAs<Request>(WorkRequest);
    }

    /// The result is the blurred value itself: every channel on, blend 1, scale 1.
    bool PlainResult() const {
        for (int c = 0; c < 4; ++c)
            if (!on[c] || scale[c] != 1.f) return false;
        return blend == 1.f;
    }

    /// Channel c's result from its source value and its blurred value.
    float MixChannel(int c, float base, float blurred) const {
        return on[c] ? base + (blurred * scale[c] - base) * blend : base;
    }

    /// A pixel's result from its source value and its blurred value.
    void Mix(const float *base, const float *blurred, float *out) const {
        for (int c = 0; c < 4; ++c) out[c] = MixChannel(c, base[c], blurred[c]);
    }
};

/// Float memory aligned for 8-wide loads.
struct AlignedFloats {
    float *data = nullptr;
    size_t count = 0;
    AlignedFloats() = default;
    AlignedFloats(const AlignedFloats &) = delete;
    AlignedFloats &operator=(const AlignedFloats &) = delete;
    ~AlignedFloats() { std::free(data); }
    float *Get(size_t n) {
        if (n > count) {
            std::free(data);
            const size_t bytes = (n * sizeof(float) + 63) / 64 * 64;
            data = static_cast<float *>(std::aligned_alloc(64, bytes));
            if (!data) {
                count = 0;
                throw std::bad_alloc();
            }
            count = n;
        }
        return data;
    }
};

/// A large float buffer from pixel memory (pooled for frame sizes).
struct PixelFloats {
    float *data = nullptr;
    size_t bytes = 0;
    PixelFloats() = default;
    PixelFloats(const PixelFloats &) = delete;
    PixelFloats &operator=(const PixelFloats &) = delete;
    ~PixelFloats() {
        if (data) FreePixels(reinterpret_cast<uint8_t *>(data), bytes);
    }
    bool Alloc(size_t floats) {
        bytes = std::max<size_t>(floats, 1) * sizeof(float);
        data = reinterpret_cast<float *>(AllocPixels(bytes));
        return data != nullptr;
    }
};

// ---- the kinds along a strip ----

/// Direct convolution: out sample i = sum over k of w[k] x in sample i + k,
/// for i in [0, n); in holds n + taps - 1 samples. Strip memory is 32-byte
/// aligned, so a sample is four 8-wide vectors.
__attribute__((target_clones("arch=x86-64-v3", "default"))) void TapsAlong(const float *in, float *out, int n,
                                                                           const float *w, int taps) {
    constexpr int kVectors = kLanes / 8;
    int i = 0;
    for (; i + 2 <= n; i += 2) { // two samples at a time: eight independent sums
        V8 a0 = {}, a1 = {}, a2 = {}, a3 = {}, b0 = {}, b1 = {}, b2 = {}, b3 = {};
        const V8 *p = reinterpret_cast<const V8 *>(in + static_cast<size_t>(i) * kLanes);
        for (int k = 0; k < taps; ++k, p += kVectors) {
            const V8 wk = V8{} + w[k];
            a0 += wk * p[0], a1 += wk * p[1], a2 += wk * p[2], a3 += wk * p[3];
            b0 += wk * p[4], b1 += wk * p[5], b2 += wk * p[6], b3 += wk * p[7];
        }
        V8 *o = reinterpret_cast<V8 *>(out + static_cast<size_t>(i) * kLanes);
        o[0] = a0, o[1] = a1, o[2] = a2, o[3] = a3, o[4] = b0, o[5] = b1, o[6] = b2, o[7] = b3;
    }
    if (i < n) {
        V8 a0 = {}, a1 = {}, a2 = {}, a3 = {};
        const V8 *p = reinterpret_cast<const V8 *>(in + static_cast<size_t>(i) * kLanes);
        for (int k = 0; k < taps; ++k, p += kVectors) {
            const V8 wk = V8{} + w[k];
            a0 += wk * p[0], a1 += wk * p[1], a2 += wk * p[2], a3 += wk * p[3];
        }
        V8 *o = reinterpret_cast<V8 *>(out + static_cast<size_t>(i) * kLanes);
        o[0] = a0, o[1] = a1, o[2] = a2, o[3] = a3;
    }
}

/// One extended box over n input samples, giving n - 2 (r + ends) outputs:
/// the sum of the 2r + 1 samples around each, plus alpha times the next one
/// out on each side, over 2r + 1 + 2 alpha. The running sum is kept in double,
/// so long lines do not drift.
template <bool Ends> void BoxAlongPlain(const float *in, int n, float *out, int r, double alpha) {
    const int reach = Ends ? r + 1 : r;
    const int m = n - 2 * reach;
    if (m <= 0) return;
    const double norm = 1.0 / (2.0 * r + 1.0 + (Ends ? 2.0 * alpha : 0.0));
    double sum[kLanes] = {};
    for (int k = reach - r; k <= reach + r; ++k) {
        const float *p = in + static_cast<size_t>(k) * kLanes;
        for (int l = 0; l < kLanes; ++l) sum[l] += p[l];
    }
    for (int i = 0; i < m; ++i) {
        const int c = i + reach;
        float *o = out + static_cast<size_t>(i) * kLanes;
        const float *enter = in + static_cast<size_t>(c + r + 1) * kLanes;
        const float *leave = in + static_cast<size_t>(c - r) * kLanes;
        if constexpr (Ends) {
            const float *lo = in + static_cast<size_t>(c - r - 1) * kLanes;
            for (int l = 0; l < kLanes; ++l)
                o[l] = static_cast<float>((sum[l] + alpha * (static_cast<double>(lo[l]) + enter[l])) * norm);
        } else {
            for (int l = 0; l < kLanes; ++l) o[l] = static_cast<float>(sum[l] * norm);
        }
        if (i + 1 < m)
            for (int l = 0; l < kLanes; ++l) sum[l] += static_cast<double>(enter[l]) - leave[l];
    }
}

#if defined(__x86_64__)
/// The same with AVX2: the 32 sums stay in eight registers for the whole line.
template <bool Ends>
__attribute__((target("avx2,fma"))) void BoxAlongAVX2(const float *in, int n, float *out, int r, double alpha) {
    constexpr int kVectors = kLanes / 4;
    const int reach = Ends ? r + 1 : r;
    const int m = n - 2 * reach;
    if (m <= 0) return;
    const __m256d norm = _mm256_set1_pd(1.0 / (2.0 * r + 1.0 + (Ends ? 2.0 * alpha : 0.0)));
    const __m256d ends = _mm256_set1_pd(alpha);
    __m256d sum[kVectors];
    for (int v = 0; v < kVectors; ++v) sum[v] = _mm256_setzero_pd();
    for (int k = reach - r; k <= reach + r; ++k)
        for (int v = 0; v < kVectors; ++v)
            sum[v] = _mm256_add_pd(sum[v], _mm256_cvtps_pd(_mm_load_ps(in + static_cast<size_t>(k) * kLanes + 4 * v)));
    for (int i = 0; i < m; ++i) {
        const int c = i + reach;
        float *o = out + static_cast<size_t>(i) * kLanes;
        const float *enter = in + static_cast<size_t>(c + r + 1) * kLanes;
        const float *leave = in + static_cast<size_t>(c - r) * kLanes;
        const float *lo = in + static_cast<size_t>(c - r - 1) * kLanes;
        for (int v = 0; v < kVectors; ++v) {
            __m256d value = sum[v];
            if constexpr (Ends) {
                const __m256d outer = _mm256_add_pd(_mm256_cvtps_pd(_mm_load_ps(lo + 4 * v)),
                                                    _mm256_cvtps_pd(_mm_load_ps(enter + 4 * v)));
                value = _mm256_fmadd_pd(ends, outer, value);
            }
            _mm_store_ps(o + 4 * v, _mm256_cvtpd_ps(_mm256_mul_pd(value, norm)));
        }
        if (i + 1 < m)
            for (int v = 0; v < kVectors; ++v)
                sum[v] = _mm256_add_pd(sum[v], _mm256_sub_pd(_mm256_cvtps_pd(_mm_load_ps(enter + 4 * v)),
                                                             _mm256_cvtps_pd(_mm_load_ps(leave + 4 * v))));
    }
}
#endif

template <bool Ends> void BoxAlong(const float *in, int n, float *out, int r, double alpha) {
#if defined(__x86_64__)
    static const bool avx2 = __builtin_cpu_supports("avx2") && __builtin_cpu_supports("fma");
    if (avx2) return BoxAlongAVX2<Ends>(in, n, out, r, alpha);
#endif
    BoxAlongPlain<Ends>(in, n, out, r, alpha);
}

/// The recursive filter forward then backward over x[0, n) in place. The
/// line continues with `canvas` on both sides forever: the forward pass
/// starts in its steady state, the backward pass from the exact continuation
/// of the forward one (the axis's boundary matrix).
__attribute__((target_clones("arch=x86-64-v3", "default"))) void RecursiveAlong(const BlurAxis &axis, float *x, int n,
                                                                                const float *canvas) {
    const int K = axis.order;
    const double g = axis.gain;
    double a[6];
    std::copy(axis.a, axis.a + 6, a);
    double hist[6][kLanes]; // hist[t % K]: the output at t
    for (int j = 0; j < K; ++j)
        for (int l = 0; l < kLanes; ++l) hist[j][l] = canvas[l];
    const double *prev[6];
    for (int t = 0; t < n; ++t) {
        for (int j = 0; j < K; ++j) prev[j] = hist[(t - 1 - j + 6 * K) % K];
        double *cur = hist[t % K];
        float *p = x + static_cast<size_t>(t) * kLanes;
        double s[kLanes];
        for (int l = 0; l < kLanes; ++l) s[l] = g * p[l];
        for (int j = 0; j < K; ++j)
            for (int l = 0; l < kLanes; ++l) s[l] -= a[j] * prev[j][l];
        for (int l = 0; l < kLanes; ++l) {
            cur[l] = s[l];
            p[l] = static_cast<float>(s[l]);
        }
    }
    // The backward pass's first K values (beyond the end), from the forward
    // pass's last K outputs.
    double future[6][kLanes]; // future[t % K]: the backward output at t
    for (int m = 0; m < K; ++m) {
        double *f = future[(n + m) % K];
        for (int l = 0; l < kLanes; ++l) f[l] = canvas[l];
        for (int i = 0; i < K; ++i) {
            const double b = axis.boundary[static_cast<size_t>(m) * K + i];
            const double *w = hist[(n - 1 - i + 6 * K) % K];
            for (int l = 0; l < kLanes; ++l) f[l] += b * (w[l] - canvas[l]);
        }
    }
    const double *next[6];
    for (int t = n - 1; t >= 0; --t) {
        for (int j = 0; j < K; ++j) next[j] = future[(t + 1 + j) % K];
        double *cur = future[t % K];
        float *p = x + static_cast<size_t>(t) * kLanes;
        double s[kLanes];
        for (int l = 0; l < kLanes; ++l) s[l] = g * p[l];
        for (int j = 0; j < K; ++j)
            for (int l = 0; l < kLanes; ++l) s[l] -= a[j] * next[j][l];
        for (int l = 0; l < kLanes; ++l) {
            cur[l] = s[l];
            p[l] = static_cast<float>(s[l]);
        }
    }
}

/// The samples of a line an axis reads to give [lo, hi), when the line holds
/// pixels only within [srcLo, srcHi) (canvas beyond).
void InputRange(const BlurAxis &axis, int lo, int hi, int srcLo, int srcHi, int &inLo, int &inHi) {
    const int reach = axis.Reach();
    if (reach >= 0) {
        inLo = lo - reach, inHi = hi + reach;
    } else if (srcLo < srcHi) {
        inLo = std::min(lo, srcLo), inHi = std::max(hi, srcHi);
    } else {
        inLo = lo, inHi = hi;
    }
}

/// Per-strip scratch memory.
struct Scratch {
    AlignedFloats in, out, work[2], values;
};

/// Columns of one-channel rows converted and interleaved at a time: the
/// strip's rows of a chunk stay in the first-level cache.
constexpr int kChunk = 128;

using V8Unaligned = float __attribute__((vector_size(32), aligned(4)));

/// Transposes an 8 x 8 block in place: v[k][i] becomes v[i][k].
__attribute__((always_inline)) inline void Transpose8(V8 (&v)[8]) {
    V8 t[8], s[8];
    for (int k = 0; k < 8; k += 2) {
        t[k] = __builtin_shufflevector(v[k], v[k + 1], 0, 8, 1, 9, 4, 12, 5, 13);
        t[k + 1] = __builtin_shufflevector(v[k], v[k + 1], 2, 10, 3, 11, 6, 14, 7, 15);
    }
    for (int k = 0; k < 8; k += 4)
        for (int h = 0; h < 2; ++h) {
            s[k + 2 * h] = __builtin_shufflevector(t[k + h], t[k + h + 2], 0, 1, 8, 9, 4, 5, 12, 13);
            s[k + 2 * h + 1] = __builtin_shufflevector(t[k + h], t[k + h + 2], 2, 3, 10, 11, 6, 7, 14, 15);
        }
    for (int k = 0; k < 4; ++k) {
        v[k] = __builtin_shufflevector(s[k], s[k + 4], 0, 1, 2, 3, 8, 9, 10, 11);
        v[k + 4] = __builtin_shufflevector(s[k], s[k + 4], 4, 5, 6, 7, 12, 13, 14, 15);
    }
}

/// strip[i * kLanes + r] = rows[r][i] for i in [0, n), r in [0, kLanes): one
/// value of each of 32 lines per sample, as 8 x 8 blocks. `strip` is 32-byte
/// aligned.
__attribute__((target_clones("arch=x86-64-v3", "default"))) void Interleave(const float *const *rows, int n,
                                                                            float *strip) {
    int i0 = 0;
    for (; i0 + 8 <= n; i0 += 8)
        for (int r0 = 0; r0 < kLanes; r0 += 8) {
            V8 block[8];
            for (int k = 0; k < 8; ++k) block[k] = *reinterpret_cast<const V8Unaligned *>(rows[r0 + k] + i0);
            Transpose8(block);
            for (int k = 0; k < 8; ++k)
                *reinterpret_cast<V8 *>(strip + static_cast<size_t>(i0 + k) * kLanes + r0) = block[k];
        }
    for (int i = i0; i < n; ++i)
        for (int r = 0; r < kLanes; ++r) strip[static_cast<size_t>(i) * kLanes + r] = rows[r][i];
}

/// The reverse for the first `count` lanes: rows[r][i] = strip[i * kLanes + r].
__attribute__((target_clones("arch=x86-64-v3", "default"))) void Deinterleave(const float *strip, int n,
                                                                              float *const *rows, int count) {
    const int whole = count / 8 * 8; // lanes moved as blocks
    int i0 = 0;
    for (; i0 + 8 <= n; i0 += 8)
        for (int r0 = 0; r0 < whole; r0 += 8) {
            V8 block[8];
            for (int k = 0; k < 8; ++k)
                block[k] = *reinterpret_cast<const V8 *>(strip + static_cast<size_t>(i0 + k) * kLanes + r0);
            Transpose8(block);
            for (int k = 0; k < 8; ++k) *reinterpret_cast<V8Unaligned *>(rows[r0 + k] + i0) = block[k];
        }
    for (int r = 0; r < count; ++r)
        for (int i = r < whole ? i0 : 0; i < n; ++i) rows[r][i] = strip[static_cast<size_t>(i) * kLanes + r];
}

/// Runs an axis along a strip: `in` holds samples [inLo, inLo + nIn) as
/// InputRange asked; `out` receives samples [lo, lo + nOut).
void RunAxis(const BlurAxis &axis, float *in, int inLo, int nIn, float *out, int lo, int nOut, const float *canvas,
             Scratch &s) {
    const size_t skip = static_cast<size_t>(lo - inLo) * kLanes;
    switch (axis.kind) {
    case BlurAxis::Kind::Taps:
        TapsAlong(in + (skip - static_cast<size_t>(axis.radius) * kLanes), out, nOut, axis.weights.data(),
                  static_cast<int>(axis.weights.size()));
        return;
    case BlurAxis::Kind::Boxes: {
        const float *cur = in;
        int n = nIn;
        for (size_t b = 0; b < axis.boxes.size(); ++b) {
            const BlurAxis::Box &box = axis.boxes[b];
            float *dst = b + 1 == axis.boxes.size() ? out : s.work[b & 1].Get(static_cast<size_t>(nIn) * kLanes);
            if (box.alpha > 0.0)
                BoxAlong<true>(cur, n, dst, box.r, box.alpha);
            else
                BoxAlong<false>(cur, n, dst, box.r, 0.0);
            n -= 2 * box.Reach();
            cur = dst;
        }
        return;
    }
    case BlurAxis::Kind::Recursive:
        RecursiveAlong(axis, in, nIn, canvas);
        std::memcpy(out, in + skip, static_cast<size_t>(nOut) * kLanes * sizeof(float));
        return;
    default: std::memcpy(out, in + skip, static_cast<size_t>(nOut) * kLanes * sizeof(float)); return;
    }
}

/// The whole row job; see the head of the file.
class Job {
public:
    Job(const Image &src, Image &dst, const Settings &set, const std::atomic<bool> *abort)
        : src_(src), dst_(dst), set_(set), abort_(abort) {}

    bool Run(const BlurAxis &ax, const BlurAxis &ay, const ImgRectI &have) {
        out_ = dst_.DataWindow();
        have_ = have;
        // Mask to mask: only the value (alpha) reaches the output, so the
        // strips carry one channel of 32 lines.
        mask_ = src_.IsMask() && dst_.IsMask();
        channels_ = mask_ ? 1 : 4;
        lines_ = kLanes / channels_;
        const FltPixel c = src_.GetCanvasColor();
        for (int l = 0; l < kLanes; l += 4)
            canvas_[l] = c.R, canvas_[l + 1] = c.G, canvas_[l + 2] = c.B, canvas_[l + 3] = c.A;
        if (mask_) std::fill(canvas_, canvas_ + kLanes, c.A);
        // Rows of the buffer: those the second pass reads that hold pixels.
        int needLo, needHi;
        InputRange(ay, out_.y0, out_.y1, have_.y0, have_.y1, needLo, needHi);
        ty0_ = std::max(needLo, have_.y0), ty1_ = std::min(needHi, have_.y1);
        if (have_.IsNull() || ty1_ < ty0_) ty0_ = ty1_ = 0;
        const int width = out_.Width();
        if (ty1_ > ty0_ && !across_.Alloc(static_cast<size_t>(ty1_ - ty0_) * width * channels_)) return false;
        // The second pass stores finished pixels straight into the output
        // when it can (masks always); otherwise its blurred values wait in `down_`.
        direct_ = mask_ || (dst_.Depth() == DepthRGBAFlt32 &&
                            (set_.PlainResult() || (src_.Depth() == DepthRGBAFlt32 && src_.HasScanLineData())));
        if (!direct_ && !down_.Alloc(static_cast<size_t>(out_.Height()) * width * 4)) return false;

        const int rowStrips = (ty1_ - ty0_ + lines_ - 1) / lines_;
        Parallel(rowStrips, [&](int i) { AcrossStrip(ax, ty0_ + i * lines_); });
        if (Stopped()) return false;
        const int colStrips = (width + lines_ - 1) / lines_;
        Parallel(colStrips, [&](int i) { DownStrip(ay, out_.x0 + i * lines_); });
        if (Stopped()) return false;
        if (!direct_) {
            ParallelRows([&](int y0, int y1) { FinishRows(y0, y1); });
            if (Stopped()) return false;
        }
        return true;
    }

private:
    bool Stopped() {
        if ((abort_ && abort_->load(std::memory_order_relaxed)) || src_.CheckAbort() || dst_.CheckAbort())
            failed_.store(true, std::memory_order_relaxed);
        return failed_.load(std::memory_order_relaxed);
    }

    /// Runs fn(i) for i in [0, count), guarding memory failures.
    template <class F> void Parallel(int count, const F &fn) {
        auto range = [&](int i0, int i1) {
            try {
                for (int i = i0; i < i1 && !Stopped(); ++i) fn(i);
            } catch (const std::bad_alloc &) {
                failed_.store(true, std::memory_order_relaxed);
            }
        };
        if (set_.threaded)
            ParallelRange(0, count, range, 1);
        else
            range(0, count);
    }

    template <class F> void ParallelRows(const F &fn) {
        auto range = [&](int y0, int y1) {
            try {
                fn(y0, y1);
            } catch (const std::bad_alloc &) {
                failed_.store(true, std::memory_order_relaxed);
            }
        };
        if (set_.threaded)
            ParallelRange(out_.y0, out_.y1, range, 8);
        else
            range(out_.y0, out_.y1);
    }

    float *AcrossRow(int y) const { return across_.data + static_cast<size_t>(y - ty0_) * out_.Width() * channels_; }
    float *DownRow(int y) const { return down_.data + static_cast<size_t>(y - out_.y0) * out_.Width() * 4; }

    /// A strip of rows from y0 (eight, or 32 of a mask) blurred across into the buffer.
    void AcrossStrip(const BlurAxis &ax, int y0) {
        Scratch &s = scratch();
        int inLo, inHi;
        InputRange(ax, out_.x0, out_.x1, have_.x0, have_.x1, inLo, inHi);
        const int nIn = inHi - inLo, width = out_.Width();
        float *in = s.in.Get(static_cast<size_t>(nIn) * kLanes);
        float *out = s.out.Get(static_cast<size_t>(width) * kLanes);
        // Pixels are read where the rows hold them; canvas elsewhere.
        const int a = std::max(inLo, have_.x0), b = std::min(inHi, have_.x1);
        if (mask_)
            ReadMaskRows(y0, inLo, nIn, a, b, in, s);
        else
            ReadPixelRows(y0, inLo, nIn, a, b, in);
        RunAxis(ax, in, inLo, nIn, out, out_.x0, width, canvas_, s);
        const int count = std::min(lines_, ty1_ - y0);
        if (mask_) {
            float *dst[kLanes];
            for (int r = 0; r < count; ++r) dst[r] = AcrossRow(y0 + r);
            Deinterleave(out, width, dst, count);
            return;
        }
        for (int r = 0; r < count; ++r) {
            float *dst = AcrossRow(y0 + r);
            const float *q = out + 4 * r;
            for (int i = 0; i < width; ++i, q += kLanes) std::memcpy(dst + 4 * i, q, 4 * sizeof(float));
        }
    }

    /// Eight rows from y0 into a strip of samples [inLo, inLo + nIn): their
    /// pixels within [a, b) and rows, canvas elsewhere.
    void ReadPixelRows(int y0, int inLo, int nIn, int a, int b, float *in) {
        row_.resize(nIn);
        const FltPixel canvas{canvas_[0], canvas_[1], canvas_[2], canvas_[3]};
        for (int r = 0; r < kStrip; ++r) {
            const int y = y0 + r;
            if (y < ty1_ && a < b) {
                std::fill(row_.begin(), row_.begin() + (a - inLo), canvas);
                ReadSpanFlt(src_, y, a, b, row_.data() + (a - inLo));
                std::fill(row_.begin() + (b - inLo), row_.end(), canvas);
            } else {
                std::fill(row_.begin(), row_.end(), canvas);
            }
            const FltPixel *p = row_.data();
            float *q = in + 4 * r;
            for (int i = 0; i < nIn; ++i, q += kLanes) std::memcpy(q, p + i, 4 * sizeof(float));
        }
    }

    /// The same for 32 rows of a mask, one lane each, read at their depth once
    /// in chunks of columns.
    void ReadMaskRows(int y0, int inLo, int nIn, int a, int b, float *in, Scratch &s) {
        for (int i = 0; i < nIn; ++i)
            if (i + inLo < a || i + inLo >= b)
                std::memcpy(in + static_cast<size_t>(i) * kLanes, canvas_, sizeof canvas_);
        float *values = s.values.Get(static_cast<size_t>(kLanes + 1) * kChunk);
        float *canvasRow = values + static_cast<size_t>(kLanes) * kChunk;
        std::fill(canvasRow, canvasRow + kChunk, canvas_[0]);
        const bool floats = src_.Depth() == DepthAFlt32;
        const float *rows[kLanes];
        for (int x = a; x < b; x += kChunk) {
            const int n = std::min(kChunk, b - x);
            for (int r = 0; r < kLanes; ++r) {
                const int y = y0 + r;
                const uint8_t *p = y < ty1_ ? src_.PixelAddress(x, y) : nullptr;
                if (!p) {
                    rows[r] = canvasRow;
                } else if (floats) {
                    rows[r] = reinterpret_cast<const float *>(p);
                } else {
                    float *v = values + static_cast<size_t>(r) * kChunk;
                    LoadMaskFlt(src_.Depth(), p, n, v);
                    rows[r] = v;
                }
            }
            Interleave(rows, n, in + static_cast<size_t>(x - inLo) * kLanes);
        }
    }

    /// A strip of columns from x0 (eight, or 32 of a mask) blurred down and finished.
    void DownStrip(const BlurAxis &ay, int x0) {
        Scratch &s = scratch();
        int inLo, inHi;
        InputRange(ay, out_.y0, out_.y1, ty0_, ty1_, inLo, inHi);
        const int nIn = inHi - inLo, height = out_.Height();
        const int cols = std::min(lines_, out_.x1 - x0), used = cols * channels_;
        float *in = s.in.Get(static_cast<size_t>(nIn) * kLanes);
        float *out = s.out.Get(static_cast<size_t>(height) * kLanes);
        for (int i = 0; i < nIn; ++i) {
            const int y = inLo + i;
            float *q = in + static_cast<size_t>(i) * kLanes;
            if (y >= ty0_ && y < ty1_) {
                std::memcpy(q, AcrossRow(y) + channels_ * (x0 - out_.x0), static_cast<size_t>(used) * sizeof(float));
                std::memcpy(q + used, canvas_, static_cast<size_t>(kLanes - used) * sizeof(float));
            } else {
                std::memcpy(q, canvas_, kLanes * sizeof(float));
            }
        }
        RunAxis(ay, in, inLo, nIn, out, out_.y0, height, canvas_, s);
        if (mask_) return FinishMaskColumns(out, x0, cols);
        const size_t bytes = static_cast<size_t>(cols) * 4 * sizeof(float);
        if (!direct_) {
            for (int y = out_.y0; y < out_.y1; ++y)
                std::memcpy(DownRow(y) + 4 * (x0 - out_.x0), out + static_cast<size_t>(y - out_.y0) * kLanes, bytes);
            return;
        }
        const bool plain = set_.PlainResult();
        const ImgRectI sw = src_.DataWindow();
        const float canvas[4] = {canvas_[0], canvas_[1], canvas_[2], canvas_[3]};
        for (int y = out_.y0; y < out_.y1; ++y) {
            float *dst = reinterpret_cast<float *>(dst_.PixelAddress(x0, y));
            const float *blurred = out + static_cast<size_t>(y - out_.y0) * kLanes;
            if (plain) {
                std::memcpy(dst, blurred, bytes);
                continue;
            }
            for (int i = 0; i < cols; ++i) {
                const int x = x0 + i;
                const float *base =
                    sw.Contains(x, y) ? reinterpret_cast<const float *>(src_.PixelAddress(x, y)) : canvas;
                float mixed[4];
                set_.Mix(base, blurred + 4 * i, mixed);
                std::memcpy(dst + 4 * i, mixed, sizeof mixed);
            }
        }
    }

    /// Up to 32 columns of a mask from x0: `out` holds their blurred values,
    /// one lane per column; each row's piece is mixed with the source (read
    /// just before it is overwritten, for blurs in place) and stored at the
    /// output's depth.
    void FinishMaskColumns(const float *out, int x0, int cols) {
        const bool plain = set_.PlainResult();
        const ImgRectI sw = src_.DataWindow();
        const int a = std::max(x0, sw.x0), b = std::min(x0 + cols, sw.x1);
        float base[kLanes], mixed[kLanes];
        for (int y = out_.y0; y < out_.y1; ++y) {
            const float *blurred = out + static_cast<size_t>(y - out_.y0) * kLanes;
            uint8_t *dst = dst_.PixelAddress(x0, y);
            if (plain) {
                StoreMaskFlt(dst_.Depth(), blurred, cols, dst);
                continue;
            }
            std::fill(base, base + cols, canvas_[0]);
            const uint8_t *p = a < b && y >= sw.y0 && y < sw.y1 ? src_.PixelAddress(a, y) : nullptr;
            if (p) LoadMaskFlt(src_.Depth(), p, b - a, base + (a - x0));
            for (int i = 0; i < cols; ++i) mixed[i] = set_.MixChannel(3, base[i], blurred[i]);
            StoreMaskFlt(dst_.Depth(), mixed, cols, dst);
        }
    }

    /// Rows of blurred values mixed with the source and stored in the output's depth.
    void FinishRows(int y0, int y1) {
        const int width = out_.Width();
        std::vector<FltPixel> base(width);
        for (int y = y0; y < y1 && !Stopped(); ++y) {
            ReadSpanFlt(src_, y, out_.x0, out_.x1, base.data());
            const float *blurred = DownRow(y);
            for (int i = 0; i < width; ++i) {
                float b[4] = {base[i].R, base[i].G, base[i].B, base[i].A}, m[4];
                set_.Mix(b, blurred + 4 * i, m);
                base[i] = {m[0], m[1], m[2], m[3]};
            }
            StoreFlt(dst_.Depth(), base.data(), width, dst_.ScanLine(y));
        }
    }

    static Scratch &scratch() {
        thread_local Scratch s;
        return s;
    }

    const Image &src_;
    Image &dst_;
    const Settings &set_;
    const std::atomic<bool> *abort_;
    std::atomic<bool> failed_{false};
    ImgRectI out_, have_;
    int ty0_ = 0, ty1_ = 0;
    bool direct_ = false, mask_ = false;
    int channels_ = 4;   ///< floats per pixel in the buffers: 1 for masks
    int lines_ = kStrip; ///< rows (or columns) in a strip: kLanes / channels_
    alignas(32) float canvas_[kLanes];
    PixelFloats across_, down_;
    static thread_local std::vector<FltPixel> row_;
};

thread_local std::vector<FltPixel> Job::row_;

/// The abort flag of a request's render, or null.
const std::atomic<bool> *AbortOf(const Request *req) {
    const RenderTask *task = req ? req->GetTask() : nullptr;
    return task ? task->AbortFlag() : nullptr;
}

// ---- the device ----

/// Both passes as the kernels "BlurRows" and "BlurColumns": the axes as
/// weight tables (one-channel float images of 2 reach + 1 texels), the
/// across pass into a float RGBA device image.
bool BlurOnDevice(const Image &src, Image &dst, const Settings &set, const BlurAxis &ax, const BlurAxis &ay,
                  const ImgRectI &have) {
    RenderTask *task = set.req ? set.req->GetTask() : nullptr;
    if (!task || !task->Device()) return false;
    const std::vector<float> wx = ax.AsTaps(), wy = ay.AsTaps();
    if (wx.empty() || wy.empty()) return false;
    const int rx = static_cast<int>(wx.size() / 2), ry = static_cast<int>(wy.size() / 2);
    const ImgRectI out = dst.DataWindow();
    // The across pass's rows: those the down pass reads that hold pixels.
    const int ty0 = std::max(out.y0 - ry, have.y0), ty1 = std::min(out.y1 + ry, have.y1);
    const bool anyRows = !have.IsNull() && ty1 > ty0;
    const FltPixel c = src.GetCanvasColor();
    const ImgRectI dw = src.DataWindow();

    auto rows = std::make_shared<BlurRowsParams>();
    const int haveWin[4] = {have.x0, have.x1, have.y0, have.y1}, inWin[4] = {dw.x0, dw.x1, dw.y0, dw.y1};
    const int tmpWin[4] = {out.x0, out.x1, anyRows ? ty0 : 0, anyRows ? ty1 : 0};
    const int outWin[4] = {out.x0, out.x1, out.y0, out.y1};
    const float canvas[4] = {c.R, c.G, c.B, c.A};
    std::memcpy(rows->canvas, canvas, sizeof canvas);
    std::memcpy(rows->haveWindow, haveWin, sizeof haveWin);
    std::memcpy(rows->inDataWindow, inWin, sizeof inWin);
    std::memcpy(rows->outWindow, tmpWin, sizeof tmpWin);
    rows->radius = rx;
    rows->workSize[0] = out.Width();
    rows->workSize[1] = tmpWin[3] - tmpWin[2];

    auto cols = std::make_shared<BlurColumnsParams>();
    std::memcpy(cols->canvas, canvas, sizeof canvas);
    std::memcpy(cols->scale, set.scale, sizeof set.scale);
    cols->blend = set.blend;
    for (int i = 0; i < 4; ++i) cols->chans[i] = set.on[i] ? 1 : 0;
    std::memcpy(cols->tmpWindow, tmpWin, sizeof tmpWin);
    std::memcpy(cols->inDataWindow, inWin, sizeof inWin);
    std::memcpy(cols->outWindow, outWin, sizeof outWin);
    cols->radius = ry;
    cols->workSize[0] = out.Width();
    cols->workSize[1] = out.Height();
    const bool srcPixels = src.HasScanLineData() || src.IsGPUMemDirty();
    if (!srcPixels) return false;

    std::string failure;
    const bool ok = task->Execute("BlurTagList", [&](IDeviceContext *ctx) {
        auto fail = [&failure](const std::string &why) {
            failure = why;
            return false;
        };
        std::unique_ptr<KROMComputeNode> across =
            KROMComputeNode::Create(ctx, "BlurRows", nullptr, BlurRowsParamsText, false);
        std::unique_ptr<KROMComputeNode> down =
            KROMComputeNode::Create(ctx, "BlurColumns", nullptr, BlurColumnsParamsText, false);
        std::unique_ptr<KROMBuffer> input = KROMBuffer::CreateImage(ctx, &src, KROMBufferRead);
        std::unique_ptr<KROMBuffer> weightsX =
            KROMBuffer::CreateImage(ctx, static_cast<int>(wx.size()), 1, DepthAFlt32, wx.data());
        std::unique_ptr<KROMBuffer> weightsY =
            KROMBuffer::CreateImage(ctx, static_cast<int>(wy.size()), 1, DepthAFlt32, wy.data());
        std::unique_ptr<KROMBuffer> tmp =
            KROMBuffer::CreateImage(ctx, out.Width(), std::max(tmpWin[3] - tmpWin[2], 1), DepthRGBAFlt32, nullptr);
        std::unique_ptr<KROMBuffer> output = KROMBuffer::CreateImage(ctx, &dst, KROMBufferWrite);
        for (const KROMComputeNode *node : {across.get(), down.get()})
            if (!node->IsValid()) return fail(node->Error());
        for (const KROMBuffer *buf : {input.get(), weightsX.get(), weightsY.get(), tmp.get(), output.get()})
            if (!buf->IsValid()) return fail(buf->Error());
        rows->srcCompOrder = input->GetCompOrder();
        rows->dstCompOrder = tmp->GetCompOrder();
        cols->srcCompOrder = input->GetCompOrder();
        cols->dstCompOrder = output->GetCompOrder();
        if (anyRows) {
            across->SetParamStruct(rows, sizeof(BlurRowsParams));
            across->AddInput("input", input.get());
            across->AddInput("weights", weightsX.get());
            across->AddOutput("output", tmp.get());
            across->AddKernelOption(KROMCommonKernelOption, ScriptVal(1.0));
            if (!across->RunSession()) return fail(across->Error());
        }
        down->SetParamStruct(cols, sizeof(BlurColumnsParams));
        down->AddInput("across", tmp.get());
        down->AddInput("input", input.get());
        down->AddInput("weights", weightsY.get());
        down->AddOutput("output", output.get());
        down->AddKernelOption(KROMCommonKernelOption, ScriptVal(1.0));
        if (!down->RunSession()) return fail(down->Error());
        dst.SetGPUMem(output->GetGPUMemory(), true);
        return true;
    });
    if (!ok) task->NoteDeviceFailure("BlurTagList", failure.empty() ? "failed" : failure);
    return ok;
}

} // namespace imgblur

bool Image::GetBlurSupport(int blurType, const ImageDomain *domain, double &x, double &y, int passes) {
    const bool frame = domain && domain->HasFrame();
    double px, py;
    BlurPixels(x, y, frame ? domain->FrameWidth() : 0, frame ? domain->xScale : 1.0, frame ? domain->yScale : 1.0, px,
               py);
    x = px, y = py;
    if (IsRecursiveBlur(ValidBlurType(blurType))) return false;
    x = MakeBlurAxis(blurType, px, passes).Reach();
    y = MakeBlurAxis(blurType, py, passes).Reach();
    return true;
}

bool Image::GetBlurSupport(int blurType, double &x, double &y, int passes) const {
    const ImageDomain domain = DomainOfImage(*this, dataWindow_);
    return GetBlurSupport(blurType, &domain, x, y, passes);
}

bool Image::BlurTagList(Image *dest, const TagList &tags) {
    using namespace imgblur;
    if (!dest) return false;
    const Settings set(tags);
    // The canvas blurs to itself; the mix applies to it as to any pixel.
    FltPixel canvas = canvas_;
    {
        const float base[4] = {canvas_.R, canvas_.G, canvas_.B, canvas_.A};
        float mixed[4];
        set.Mix(base, base, mixed);
        canvas = {mixed[0], mixed[1], mixed[2], mixed[3]};
    }
    const ImgRectI out = dest->DataWindow();
    if (dest->IsNoData() || out.IsNull()) {
        dest->SetCanvasColor(canvas);
        return true;
    }
    double px, py;
    BlurPixels(set.x, set.y, width_, xScale_, yScale_, px, py);
    const BlurAxis ax = MakeBlurAxis(set.type, px, set.passes), ay = MakeBlurAxis(set.type, py, set.passes);
    // Where the source holds pixels for the blur.
    ImgRectI have = noData_ ? ImgRectI() : dataWindow_;
    if (set.sourceWindow) have &= *set.sourceWindow;
    if (have.IsNull()) have = ImgRectI();

    // The device takes the finite kinds into another image (one image cannot
    // be its own kernel's input and output).
    if (set.useGPU && dest != this && ax.kind != BlurAxis::Kind::Recursive && ay.kind != BlurAxis::Kind::Recursive &&
        !noData_ && BlurOnDevice(*this, *dest, set, ax, ay, have)) {
        dest->SetCanvasColor(canvas);
        return true;
    }
    if (!DownloadGPUMem() || (dest != this && !dest->DownloadGPUMem())) return false;
    if (!HasScanLineData()) have = ImgRectI();
    if (!dest->AllocScanLineData()) return false;
    Job job(*this, *dest, set, AbortOf(set.req));
    const bool ok = job.Run(ax, ay, have);
    dest->SetGPUMem(nullptr, false); // whatever the device held is not the result
    dest->SetCanvasColor(canvas);
    return ok;
}

Ref<Image> Image::BlurOfImageTagList(const TagList &tags) {
    const ImgRectI dw = dataWindow_, vw = validWindow_;
    Ref<Image> out = NewImageTagList({{ImgLikeImage, this},
                                      {ImgDataWindow, &dw},
                                      {ImgValidWindow, &vw},
                                      {ImgNoData, noData_},
                                      {ImgCanvasColor, &canvas_}});
    if (!out) return nullptr;
    out->Metadata() = metadata_;
    out->SetIsOpaque(opaque_);
    if (!BlurTagList(out.Get(), tags)) return nullptr;
    return out;
}

} // namespace Orvane
