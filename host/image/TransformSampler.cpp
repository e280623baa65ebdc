#include "host/image/TransformSampler.h"

#include <algorithm>
#include <climits>
#include <cmath>
#include <cstring>
#include <new>
#include <tuple>
#include <type_traits>
#include <vector>

#include "host/core/Parallel.h"
#include "host/image/Half.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/image/PointMapping.h"

namespace Orvane {
namespace xfsampler {

/// Positions closer than this to a whole number (or a half) count as on it.
constexpr double kSnap = 1e-9;
/// Table entries per unit of distance for the filters read from a table.
constexpr int kTablePerUnit = 4096;
/// A source index that reads the canvas colour.
constexpr int kCanvas = INT_MIN;

bool NearWhole(double v, double &whole) {
    whole = std::round(v);
    return std::fabs(v - whole) < kSnap;
}

/// The linear part maps each output axis from one source axis (diagonal or
/// anti-diagonal), so sides of a rectangle map to sides.
bool KeepsAxesApart(const Matrix3 &m) {
    return (m(0, 1) == 0.0 && m(1, 0) == 0.0 && m(0, 0) != 0.0 && m(1, 1) != 0.0) ||
           (m(0, 0) == 0.0 && m(1, 1) == 0.0 && m(0, 1) != 0.0 && m(1, 0) != 0.0);
}

constexpr ImgRectI kEndless(-DomainEndless, -DomainEndless, DomainEndless, DomainEndless);

/// Maps a rectangle [x0, x1] x [y0, y1] (real corners) through an affine
/// matrix and returns the bounding box of the result in reals.
void MapBox(const Matrix3 &m, double x0, double y0, double x1, double y1, double &ox0, double &oy0, double &ox1,
            double &oy1) {
    const double xs[2] = {x0, x1}, ys[2] = {y0, y1};
    ox0 = oy0 = HUGE_VAL;
    ox1 = oy1 = -HUGE_VAL;
    for (double x : xs)
        for (double y : ys) {
            double u, v;
            m.Apply(x, y, u, v);
            ox0 = std::min(ox0, u), ox1 = std::max(ox1, u);
            oy0 = std::min(oy0, v), oy1 = std::max(oy1, v);
        }
}

int ClampToInt(double v) {
    return static_cast<int>(std::clamp(v, -static_cast<double>(DomainEndless), static_cast<double>(DomainEndless)));
}

/// The pixels whose centres lie in the box of the pixel centres of `r`
/// grown by (gx, gy) on each side and mapped through `m` (its bounding box).
/// `closed`: a centre on the box's border counts (nearest and box filters
/// weigh a tap at exactly their radius); otherwise it does not (the other
/// filters are zero there). Endless sides stay endless where `m` keeps the
/// axes apart; otherwise any endless side makes the result endless.
ImgRectI MapCentres(const ImgRectI &r, const Matrix3 &m, double gx, double gy, bool closed) {
    if (r.IsNull()) return ImgRectI();
    const bool endless[4] = {IsEndlessSide(r.x0), IsEndlessSide(r.y0), IsEndlessSide(r.x1), IsEndlessSide(r.y1)};
    const bool anyEndless = endless[0] || endless[1] || endless[2] || endless[3];
    if (anyEndless && !KeepsAxesApart(m)) return kEndless;
    double X0, Y0, X1, Y1;
    MapBox(m, r.x0 + 0.5 - gx, r.y0 + 0.5 - gy, r.x1 - 0.5 + gx, r.y1 - 0.5 + gy, X0, Y0, X1, Y1);
    // Pixel i has its centre at i + 0.5.
    auto first = [closed](double lo) {
        return ClampToInt(closed ? std::ceil(lo - 0.5 - kSnap) : std::floor(lo - 0.5 + kSnap) + 1.0);
    };
    auto end = [closed](double hi) {
        return ClampToInt(closed ? std::floor(hi - 0.5 + kSnap) + 1.0 : std::ceil(hi - 0.5 - kSnap));
    };
    ImgRectI out(first(X0), first(Y0), end(X1), end(Y1));
    if (anyEndless) {
        // Each output side comes from one source side: keep the endless ones.
        const bool swap = m(0, 0) == 0.0;
        const double fx = swap ? m(0, 1) : m(0, 0), fy = swap ? m(1, 0) : m(1, 1);
        const bool lowX = swap ? endless[1] : endless[0], highX = swap ? endless[3] : endless[2];
        const bool lowY = swap ? endless[0] : endless[1], highY = swap ? endless[2] : endless[3];
        if (fx > 0 ? lowX : highX) out.x0 = -DomainEndless;
        if (fx > 0 ? highX : lowX) out.x1 = DomainEndless;
        if (fy > 0 ? lowY : highY) out.y0 = -DomainEndless;
        if (fy > 0 ? highY : lowY) out.y1 = DomainEndless;
    }
    if (out.IsNull()) out.SetNull();
    return out;
}

/// Filter values by distance in filter units: nearest, box and the tent are
/// computed, the others read from a table with linear interpolation (error
/// far below float precision for these smooth curves).
class Kernel {
public:
    Kernel(int filter, int window) : filter_(ValidResizeFilter(filter)), support_(ResizeFilterSupport(filter_)) {
        if (filter_ <= RszLinear) return;
        const int n = static_cast<int>(support_ * kTablePerUnit) + 2;
        table_.resize(n);
        for (int i = 0; i < n; ++i)
            table_[i] = static_cast<float>(ResizeFilterValue(filter_, window, static_cast<double>(i) / kTablePerUnit));
    }
    int Filter() const { return filter_; }
    double Support() const { return support_; }
    double operator()(double d) const {
        const double ad = std::fabs(d);
        switch (filter_) {
        case RszNearest:
        case RszBox: return ad <= 0.5 ? 1.0 : 0.0;
        case RszLinear: return ad < 1.0 ? 1.0 - ad : 0.0;
        default: {
            if (ad >= support_) return 0.0;
            const double t = ad * kTablePerUnit;
            const int i = static_cast<int>(t);
            const double f = t - i;
            return table_[i] * (1.0 - f) + table_[i + 1] * f;
        }
        }
    }

private:
    int filter_;
    double support_;
    std::vector<float> table_;
};

/// Where one source axis may be read: the frame the edge policy folds into
/// and the data window that holds pixels.
struct AxisRange {
    int frameLo, frameHi; ///< the source frame along this axis
    int dataLo, dataHi;   ///< the data window along this axis (empty without rows)
    int edges;

    /// The source index a tap at k reads, or kCanvas.
    int Map(int k) const {
        if (edges != EdgeCanvas && (k < frameLo || k >= frameHi)) k = MapEdge(k, frameLo, frameHi, edges);
        return k >= dataLo && k < dataHi ? k : kCanvas;
    }
};

/// The taps of one output position along one axis: source indices (relative
/// to the data window's start) with weights that, with `canvas`, add up to 1.
struct Taps {
    std::vector<int> index;
    std::vector<float> weight;
    float canvas = 0.f;
};

/// Builds the taps of source position u along an axis; appends to `index`
/// and `weight` and returns the canvas weight. Weights are normalised.
float BuildTaps(double u, double stretch, const Kernel &k, const AxisRange &axis, std::vector<int> &index,
                std::vector<float> &weight, std::vector<double> &raw) {
    const size_t first = index.size();
    if (k.Filter() == RszNearest) {
        const int s = axis.Map(static_cast<int>(std::floor(u + kSnap)));
        if (s == kCanvas) return 1.f;
        index.push_back(s - axis.dataLo);
        weight.push_back(1.f);
        return 0.f;
    }
    const double radius = k.Support() * stretch;
    const int k0 = static_cast<int>(std::ceil(u - radius - 0.5));
    const int k1 = static_cast<int>(std::floor(u + radius - 0.5));
    double total = 0.0, canvas = 0.0;
    // The weights in double until normalised, rounded once, as the fixed-tap
    // path rounds them: both give the same bits.
    raw.clear();
    for (int j = k0; j <= k1; ++j) {
        const double w = k((j + 0.5 - u) / stretch);
        if (w == 0.0) continue;
        total += w;
        const int s = axis.Map(j);
        if (s == kCanvas) {
            canvas += w;
        } else {
            index.push_back(s - axis.dataLo);
            raw.push_back(w);
        }
    }
    if (total == 0.0) { // no tap carries weight (cannot happen for these filters): the nearest pixel
        index.resize(first);
        const int s = axis.Map(static_cast<int>(std::floor(u)));
        if (s == kCanvas) return 1.f;
        index.push_back(s - axis.dataLo);
        weight.push_back(1.f);
        return 0.f;
    }
    const double inv = 1.0 / total;
    for (double w : raw) weight.push_back(static_cast<float>(w * inv));
    return static_cast<float>(canvas * inv);
}

// ---- reading stored components ----

template <ComponentType CT> struct Comp;
template <> struct Comp<ComponentType::Int8> {
    using T = uint8_t;
    static float Get(const T *p) { return *p * (1.f / 255.f); }
};
template <> struct Comp<ComponentType::Int16> {
    using T = uint16_t;
    static float Get(const T *p) { return *p * (1.f / 65535.f); }
};
template <> struct Comp<ComponentType::Flt16> {
    using T = uint16_t;
    static float Get(const T *p) { return HalfToFloat(*p); }
};
template <> struct Comp<ComponentType::Flt32> {
    using T = float;
    static float Get(const T *p) { return *p; }
};

/// One output pixel: the y taps [y, y + ny) over the x taps [x, x + nx).
/// `acc` receives C channels.
template <ComponentType CT, int C> struct Gather {
    using T = typename Comp<CT>::T;
    static void Pixel(const uint8_t *const *rows, const int *xi, const float *xw, int nx, float xc, const int *yi,
                      const float *yw, int ny, float yc, const float *canvas, float *acc) {
        float sum[C] = {};
        for (int t = 0; t < ny; ++t) {
            const T *row = reinterpret_cast<const T *>(rows[yi[t]]);
            float s[C] = {};
            for (int q = 0; q < nx; ++q) {
                const T *p = row + static_cast<size_t>(xi[q]) * C;
                const float w = xw[q];
                for (int c = 0; c < C; ++c) s[c] += w * Comp<CT>::Get(p + c);
            }
            const float w = yw[t];
            for (int c = 0; c < C; ++c) sum[c] += w * (s[c] + xc * canvas[c]);
        }
        for (int c = 0; c < C; ++c) acc[c] = sum[c] + yc * canvas[c];
    }
};

/// What every path shares.
struct Job {
    const Image *src;
    Image *dst;
    Matrix3 map; ///< output -> source
    AxisRange ax, ay;
    Kernel kernel;
    double stretchX, stretchY;
    std::vector<const uint8_t *> rows; ///< source rows by (y - data y0)
    FltPixel canvas;
    const std::atomic<bool> *abort;
    std::atomic<bool> stopped{false};

    Job(const Image &s, Image &d, const Matrix3 &m, const TransformSampling &smp, const std::atomic<bool> *a)
        : src(&s), dst(&d), map(m), kernel(smp.filter, smp.window), canvas(s.GetCanvasColor()), abort(a) {
        const ImgRectI f = s.Frame();
        ImgRectI dw = s.HasScanLineData() ? s.DataWindow() : ImgRectI();
        ax = {f.x0, f.x1, dw.x0, dw.IsNull() ? dw.x0 : dw.x1, smp.edges};
        ay = {f.y0, f.y1, dw.y0, dw.IsNull() ? dw.y0 : dw.y1, smp.edges};
        TransformStretch(m, smp.filter, stretchX, stretchY);
        rows.resize(std::max(0, ay.dataHi - ay.dataLo));
        for (int y = ay.dataLo; y < ay.dataHi; ++y) rows[y - ay.dataLo] = s.ScanLine(y);
    }
    bool Aborted() {
        if (stopped.load(std::memory_order_relaxed)) return true;
        if ((abort && abort->load(std::memory_order_relaxed)) || src->CheckAbort() || dst->CheckAbort()) {
            stopped.store(true, std::memory_order_relaxed);
            return true;
        }
        return false;
    }
};

/// Rows of `dst` in parallel; fn(y, FltPixel *row) fills one row of floats,
/// which is then stored in the output's depth.
template <class Fn> void ForRows(Job &job, const Fn &fn) {
    const ImgRectI dw = job.dst->DataWindow();
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            std::vector<FltPixel> out(dw.Width());
            for (int y = y0; y < y1; ++y) {
                if (job.Aborted()) return;
                fn(y, out.data());
                StoreFlt(job.dst->Depth(), out.data(), dw.Width(), job.dst->ScanLine(y));
            }
        },
        2);
}

template <ComponentType CT, int C> void Store(const float *acc, FltPixel &p) {
    if constexpr (C == 4)
        p = {acc[0], acc[1], acc[2], acc[3]};
    else
        p = {acc[0], acc[0], acc[0], acc[0]};
}

/// Taps of a run of positions along one axis, computed once (the diagonal
/// path: u depends on the output column only, v on the row only).
struct TapTable {
    std::vector<int> start, count, index;
    std::vector<float> weight, canvas;
    void Build(int n, double first, double step, double stretch, const Kernel &k, const AxisRange &axis) {
        start.resize(n), count.resize(n), canvas.resize(n);
        std::vector<double> raw;
        for (int i = 0; i < n; ++i) {
            start[i] = static_cast<int>(index.size());
            canvas[i] = BuildTaps(first + step * i, stretch, k, axis, index, weight, raw);
            count[i] = static_cast<int>(index.size()) - start[i];
        }
    }
};

/// Output rows the diagonal path filters down from one set of rows filtered
/// across: enough to share those rows, few enough to bound the memory.
constexpr int kBandRows = 16;
/// Most taps per axis of the fixed-tap path (sinc and Bessel at scale 1).
constexpr int kMaxFixedTaps = 8;

/// Diagonal mappings in two passes: each source row a band of output rows
/// needs is filtered across once (x taps per output column), then the band's
/// rows are filtered down (y taps per output row).
template <ComponentType CT, int C> void RunDiagonal(Job &job) {
    using T = typename Comp<CT>::T;
    const ImgRectI dw = job.dst->DataWindow();
    const int w = dw.Width();
    const Matrix3 &m = job.map;
    TapTable tx, ty;
    tx.Build(w, m(0, 0) * (dw.x0 + 0.5) + m(0, 2), m(0, 0), job.stretchX, job.kernel, job.ax);
    ty.Build(dw.Height(), m(1, 1) * (dw.y0 + 0.5) + m(1, 2), m(1, 1), job.stretchY, job.kernel, job.ay);
    const float canvas[4] = {C == 4 ? job.canvas.R : job.canvas.A, job.canvas.G, job.canvas.B, job.canvas.A};
    // One source row filtered across, canvas weight included (each output
    // column's x weights and canvas add up to 1).
    auto across = [&](int l, float *h) {
        const T *row = reinterpret_cast<const T *>(job.rows[l]);
        for (int i = 0; i < w; ++i) {
            float s[C] = {};
            const int *xi = tx.index.data() + tx.start[i];
            const float *xw = tx.weight.data() + tx.start[i];
            for (int q = 0; q < tx.count[i]; ++q) {
                const T *px = row + static_cast<size_t>(xi[q]) * C;
                for (int c = 0; c < C; ++c) s[c] += xw[q] * Comp<CT>::Get(px + c);
            }
            for (int c = 0; c < C; ++c) h[i * C + c] = s[c] + tx.canvas[i] * canvas[c];
        }
    };
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            std::vector<float> acc(static_cast<size_t>(w) * C);
            std::vector<FltPixel> out(w);
            std::vector<std::vector<float>> rows; // the band's source rows filtered across, by index - lo
            for (int b0 = y0; b0 < y1; b0 += kBandRows) {
                const int b1 = std::min(y1, b0 + kBandRows);
                int lo = INT_MAX, hi = INT_MIN;
                for (int r = b0 - dw.y0; r < b1 - dw.y0; ++r)
                    for (int t = 0; t < ty.count[r]; ++t) {
                        lo = std::min(lo, ty.index[ty.start[r] + t]);
                        hi = std::max(hi, ty.index[ty.start[r] + t]);
                    }
                rows.assign(hi >= lo ? hi - lo + 1 : 0, {});
                for (int y = b0; y < b1; ++y) {
                    if (job.Aborted()) return;
                    const int r = y - dw.y0;
                    std::fill(acc.begin(), acc.end(), 0.f);
                    for (int t = 0; t < ty.count[r]; ++t) {
                        std::vector<float> &h = rows[ty.index[ty.start[r] + t] - lo];
                        if (h.empty()) {
                            h.resize(static_cast<size_t>(w) * C);
                            across(ty.index[ty.start[r] + t], h.data());
                        }
                        const float wy = ty.weight[ty.start[r] + t];
                        for (size_t k = 0; k < acc.size(); ++k) acc[k] += wy * h[k];
                    }
                    const float yc = ty.canvas[r];
                    for (int i = 0; i < w; ++i) {
                        float a[C];
                        for (int c = 0; c < C; ++c) a[c] = acc[i * C + c] + yc * canvas[c];
                        Store<CT, C>(a, out[i]);
                    }
                    StoreFlt(job.dst->Depth(), out.data(), w, job.dst->ScanLine(y));
                }
            }
        },
        kBandRows);
}

/// Filter weights of `n` consecutive taps from k0 at source position u,
/// normalised; false when they add up to nothing.
bool FixedWeights(const Kernel &k, double u, int k0, int n, float *w) {
    double d[kMaxFixedTaps], sum = 0.0;
    for (int q = 0; q < n; ++q) sum += d[q] = k(k0 + q + 0.5 - u);
    if (sum == 0.0) return false;
    const double inv = 1.0 / sum;
    for (int q = 0; q < n; ++q) w[q] = static_cast<float>(d[q] * inv);
    return true;
}

/// The tap lists of one pixel, reused from pixel to pixel of a row.
struct TapBuffers {
    std::vector<int> xi, yi;
    std::vector<float> xw, yw;
    std::vector<double> raw;
};

/// One output pixel from the taps at source position (u, v) with stretches
/// (sx, sy), each tap mapped by the edge policy.
template <ComponentType CT, int C>
void SampleAt(Job &job, double u, double v, double sx, double sy, const float *canvas, TapBuffers &b, FltPixel &out) {
    b.xi.clear(), b.xw.clear(), b.yi.clear(), b.yw.clear();
    const float xc = BuildTaps(u, sx, job.kernel, job.ax, b.xi, b.xw, b.raw);
    const float yc = BuildTaps(v, sy, job.kernel, job.ay, b.yi, b.yw, b.raw);
    float acc[C];
    Gather<CT, C>::Pixel(job.rows.data(), b.xi.data(), b.xw.data(), static_cast<int>(b.xi.size()), xc, b.yi.data(),
                         b.yw.data(), static_cast<int>(b.yi.size()), yc, canvas, acc);
    Store<CT, C>(acc, out);
}

/// The fixed-tap fast path of an unstretched filter (Box excluded): n = ceil(2 x radius) columns and rows read
/// directly where they all lie inside the data window (and the frame, for folding edges). False, leaving `out`,
/// where they do not: the caller maps each tap by the edge policy (SampleAt).
template <ComponentType CT, int C> struct FixedTaps {
    using T = typename Comp<CT>::T;
    int n = 0, xLo = 0, xHi = 0, yLo = 0, yHi = 0;
    double radius = 0.0;
    explicit FixedTaps(const Job &job) : radius(job.kernel.Support()) {
        n = job.kernel.Filter() > RszBox ? static_cast<int>(std::ceil(2.0 * radius)) : 0;
        auto inside = [](const AxisRange &a) {
            return a.edges == EdgeCanvas ? std::pair{a.dataLo, a.dataHi}
                                         : std::pair{std::max(a.dataLo, a.frameLo), std::min(a.dataHi, a.frameHi)};
        };
        std::tie(xLo, xHi) = inside(job.ax);
        std::tie(yLo, yHi) = inside(job.ay);
    }
    bool Pixel(const Job &job, double u, double v, FltPixel &out) const {
        if (n == 0) return false;
        // Taps k with |k + 0.5 - u| < radius: k0 .. k0 + n - 1.
        const int k0 = static_cast<int>(std::floor(u - 0.5 - radius)) + 1;
        const int l0 = static_cast<int>(std::floor(v - 0.5 - radius)) + 1;
        float wx[kMaxFixedTaps], wy[kMaxFixedTaps];
        if (!(k0 >= xLo && k0 + n <= xHi && l0 >= yLo && l0 + n <= yHi && FixedWeights(job.kernel, u, k0, n, wx) &&
              FixedWeights(job.kernel, v, l0, n, wy)))
            return false;
        float sum[C] = {};
        for (int t = 0; t < n; ++t) {
            const T *p = reinterpret_cast<const T *>(job.rows[l0 + t - job.ay.dataLo]) +
                         static_cast<size_t>(k0 - job.ax.dataLo) * C;
            float s[C] = {};
            for (int q = 0; q < n; ++q)
                for (int c = 0; c < C; ++c) s[c] += wx[q] * Comp<CT>::Get(p + q * C + c);
            for (int c = 0; c < C; ++c) sum[c] += wy[t] * s[c];
        }
        Store<CT, C>(sum, out);
        return true;
    }
};

/// Any affine mapping: taps per output pixel. Where the filter is not
/// stretched and every tap lies inside the data window (and the frame, for
/// folding edges), the taps are a fixed run of ceil(2 x radius) columns and
/// rows read directly; elsewhere each tap is mapped by the edge policy.
template <ComponentType CT, int C> void RunGeneral(Job &job) {
    const ImgRectI dw = job.dst->DataWindow();
    const Matrix3 &m = job.map;
    const float canvas[4] = {C == 4 ? job.canvas.R : job.canvas.A, job.canvas.G, job.canvas.B, job.canvas.A};
    const bool unstretched = job.stretchX == 1.0 && job.stretchY == 1.0;
    const FixedTaps<CT, C> fixed(job);
    ForRows(job, [&](int y, FltPixel *out) {
        TapBuffers taps;
        const double cy = y + 0.5;
        for (int i = 0; i < dw.Width(); ++i) {
            const double cx = dw.x0 + i + 0.5;
            const double u = m(0, 0) * cx + m(0, 1) * cy + m(0, 2);
            const double v = m(1, 0) * cx + m(1, 1) * cy + m(1, 2);
            if (!(unstretched && fixed.Pixel(job, u, v, out[i])))
                SampleAt<CT, C>(job, u, v, job.stretchX, job.stretchY, canvas, taps, out[i]);
        }
    });
}

/// The copy path: output pixel (i, j) is source pixel (a i + b j + k0,
/// c i + d j + l0), bytes as they are.
void RunCopy(Job &job) {
    Image &dst = *job.dst;
    const ImgRectI dw = dst.DataWindow();
    const Matrix3 &m = job.map;
    const int a = static_cast<int>(std::round(m(0, 0))), b = static_cast<int>(std::round(m(0, 1)));
    const int c = static_cast<int>(std::round(m(1, 0))), d = static_cast<int>(std::round(m(1, 1)));
    const int k0 = static_cast<int>(std::round(0.5 * m(0, 0) + 0.5 * m(0, 1) + m(0, 2) - 0.5));
    const int l0 = static_cast<int>(std::round(0.5 * m(1, 0) + 0.5 * m(1, 1) + m(1, 2) - 0.5));
    const size_t bpp = dst.BytesPerPixel();
    uint8_t canvasBytes[16];
    StoreFlt(dst.Depth(), &job.canvas, 1, canvasBytes);
    const bool plainMove = a == 1 && b == 0 && c == 0 && d == 1 && job.ax.edges == EdgeCanvas;
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            for (int y = y0; y < y1; ++y) {
                if (job.Aborted()) return;
                uint8_t *out = dst.ScanLine(y);
                if (plainMove) {
                    // One source row: canvas, the overlapping span, canvas.
                    const int l = job.ay.Map(y + l0);
                    const int lo = std::clamp(job.ax.dataLo - k0, dw.x0, dw.x1);
                    const int hi = std::clamp(job.ax.dataHi - k0, lo, dw.x1);
                    const bool row = l != kCanvas && hi > lo;
                    for (int x = dw.x0; x < dw.x1; ++x)
                        if (!row || x < lo || x >= hi) std::memcpy(out + (x - dw.x0) * bpp, canvasBytes, bpp);
                    if (row)
                        std::memcpy(out + (lo - dw.x0) * bpp,
                                    job.rows[l - job.ay.dataLo] + (lo + k0 - job.ax.dataLo) * bpp, (hi - lo) * bpp);
                    continue;
                }
                for (int x = dw.x0; x < dw.x1; ++x) {
                    const int k = job.ax.Map(a * x + b * y + k0);
                    const int l = job.ay.Map(c * x + d * y + l0);
                    const uint8_t *p = k == kCanvas || l == kCanvas
                                           ? canvasBytes
                                           : job.rows[l - job.ay.dataLo] + (k - job.ax.dataLo) * bpp;
                    std::memcpy(out + (x - dw.x0) * bpp, p, bpp);
                }
            }
        },
        8);
}

/// Calls fn(CT, C) with the source's component type and channel count as
/// integral constants, so that one templated path serves every format.
template <class Fn> void ForFormat(const Image &src, const Fn &fn) {
    using I8 = std::integral_constant<ComponentType, ComponentType::Int8>;
    using I16 = std::integral_constant<ComponentType, ComponentType::Int16>;
    using F16 = std::integral_constant<ComponentType, ComponentType::Flt16>;
    using F32 = std::integral_constant<ComponentType, ComponentType::Flt32>;
    const auto channels = [&](auto ct) {
        if (src.Format().channels == 4)
            fn(ct, std::integral_constant<int, 4>{});
        else
            fn(ct, std::integral_constant<int, 1>{});
    };
    switch (src.Format().type) {
    case ComponentType::Int8: channels(I8{}); break;
    case ComponentType::Int16: channels(I16{}); break;
    case ComponentType::Flt16: channels(F16{}); break;
    default: channels(F32{}); break;
    }
}

/// Smallest w a projective mapping accepts: nearer the horizon, positions
/// run off beyond any image.
constexpr double kMinW = 1e-12;

/// Any point mapping: per output pixel the source position, the stretch from
/// the mapping's differences over one output pixel, then taps as the general
/// path builds them.
template <ComponentType CT, int C> void RunMapped(Job &job, const PointMapping &map) {
    const ImgRectI dw = job.dst->DataWindow();
    const float canvas[4] = {C == 4 ? job.canvas.R : job.canvas.A, job.canvas.G, job.canvas.B, job.canvas.A};
    const bool stretch = job.kernel.Filter() != RszNearest;
    const FixedTaps<CT, C> fixed(job);
    constexpr int kSpan = 128; // positions mapped per call: one virtual call per span, on the stack
    ForRows(job, [&](int y, FltPixel *out) {
        MappedSample span[kSpan];
        TapBuffers taps;
        for (int i0 = 0; i0 < dw.Width(); i0 += kSpan) {
            const int n = std::min(kSpan, dw.Width() - i0);
            map.MapSpan(dw.x0 + i0 + 0.5, y + 0.5, n, span, stretch);
            for (int k = 0; k < n; ++k) {
                const MappedSample &m = span[k];
                if (!m.ok)
                    Store<CT, C>(canvas, out[i0 + k]);
                else if (!(m.sx == 1.0 && m.sy == 1.0 && fixed.Pixel(job, m.u, m.v, out[i0 + k])))
                    SampleAt<CT, C>(job, m.u, m.v, m.sx, m.sy, canvas, taps, out[i0 + k]);
            }
        }
    });
}

void RunMapped(Job &job, const PointMapping &map) {
    ForFormat(*job.src, [&](auto ct, auto c) { RunMapped<decltype(ct)::value, decltype(c)::value>(job, map); });
}

/// The w of (x, y) through a matrix.
double WOf(const Matrix3 &m, double x, double y) { return m(2, 0) * x + m(2, 1) * y + m(2, 2); }

/// For a projective `m`: the bounding box of the corners of [x0, x1] x
/// [y0, y1] mapped through it, or false when a corner is endless or at or
/// beyond the horizon (the box then has no bound).
bool ProjectiveBox(const Matrix3 &m, double x0, double y0, double x1, double y1, double &ox0, double &oy0, double &ox1,
                   double &oy1) {
    const double big = static_cast<double>(DomainEndless);
    if (std::fabs(x0) >= big || std::fabs(x1) >= big || std::fabs(y0) >= big || std::fabs(y1) >= big) return false;
    const double xs[2] = {x0, x1}, ys[2] = {y0, y1};
    ox0 = oy0 = HUGE_VAL;
    ox1 = oy1 = -HUGE_VAL;
    for (double x : xs)
        for (double y : ys) {
            if (WOf(m, x, y) <= kMinW) return false;
            double u, v;
            m.Apply(x, y, u, v);
            ox0 = std::min(ox0, u), ox1 = std::max(ox1, u);
            oy0 = std::min(oy0, v), oy1 = std::max(oy1, v);
        }
    return true;
}

/// The whole pixels covering a real box grown by g on each side (endless
/// past the int range).
ImgRectI CoverBox(double x0, double y0, double x1, double y1, double g) {
    return ImgRectI(ClampToInt(std::floor(x0 - g)), ClampToInt(std::floor(y0 - g)), ClampToInt(std::ceil(x1 + g)),
                    ClampToInt(std::ceil(y1 + g)));
}

template <ComponentType CT, int C> void RunFiltered(Job &job) {
    if (job.map(0, 1) == 0.0 && job.map(1, 0) == 0.0)
        RunDiagonal<CT, C>(job);
    else
        RunGeneral<CT, C>(job);
}

void RunFiltered(Job &job) {
    ForFormat(*job.src, [&](auto ct, auto c) { RunFiltered<decltype(ct)::value, decltype(c)::value>(job); });
}

} // namespace xfsampler

bool IsPixelPermutation(const Matrix3 &m) {
    using namespace xfsampler;
    if (!m.IsAffine()) return false;
    double e[4];
    for (int r = 0; r < 2; ++r)
        for (int c = 0; c < 2; ++c)
            if (!NearWhole(m(r, c), e[r * 2 + c]) || std::fabs(e[r * 2 + c]) > 1.0) return false;
    const bool direct = e[1] == 0.0 && e[2] == 0.0 && e[0] != 0.0 && e[3] != 0.0;
    const bool swapped = e[0] == 0.0 && e[3] == 0.0 && e[1] != 0.0 && e[2] != 0.0;
    if (!direct && !swapped) return false;
    // The centre of pixel (0, 0) must land on a pixel centre.
    double u, v, whole;
    m.Apply(0.5, 0.5, u, v);
    return NearWhole(u - 0.5, whole) && NearWhole(v - 0.5, whole);
}

void TransformStretch(const Matrix3 &m, int filter, double &sx, double &sy) {
    sx = sy = 1.0;
    if (ValidResizeFilter(filter) == RszNearest) return;
    FootprintStretch(m(0, 0), m(0, 1), m(1, 0), m(1, 1), sx, sy);
}

ImgRectI TransformedWindow(const ImgRectI &srcWindow, const Matrix3 &sourceToOutput,
                           const TransformSampling &sampling) {
    using namespace xfsampler;
    Matrix3 inv;
    if (!sourceToOutput.Invert(inv)) return ImgRectI();
    if (sampling.edges != EdgeCanvas) return kEndless;
    if (!sourceToOutput.IsAffine()) {
        // The source window grown by the filter's reach in source pixels,
        // mapped, plus the reach in output pixels where the map shrinks.
        // With a corner beyond the horizon the image runs off without end.
        Matrix3 m;
        if (srcWindow.IsNull()) return ImgRectI();
        const double reach = ResizeFilterSupport(ValidResizeFilter(sampling.filter)) + 1.0;
        double X0, Y0, X1, Y1;
        if (!ProjectiveMapping::Facing(sourceToOutput, 0.5 * (srcWindow.x0 + srcWindow.x1),
                                       0.5 * (srcWindow.y0 + srcWindow.y1), m) ||
            !ProjectiveBox(m, srcWindow.x0 - reach, srcWindow.y0 - reach, srcWindow.x1 + reach, srcWindow.y1 + reach,
                           X0, Y0, X1, Y1))
            return kEndless;
        return CoverBox(X0, Y0, X1, Y1, reach);
    }
    // The copy path moves pixel centres onto pixel centres.
    if (IsPixelPermutation(inv)) return MapCentres(srcWindow, sourceToOutput, 0.0, 0.0, true);
    // A tap at k carries weight while |k + 0.5 - u| < radius (nearest and
    // box: <= half their width): the window's pixel centres reach that far.
    const int filter = ValidResizeFilter(sampling.filter);
    double sx, sy;
    TransformStretch(inv, filter, sx, sy);
    const double support = ResizeFilterSupport(filter);
    return MapCentres(srcWindow, sourceToOutput, support * sx, support * sy, filter <= RszBox);
}

ImgRectI TransformSourceWindow(const ImgRectI &outWindow, const Matrix3 &sourceToOutput,
                               const TransformSampling &sampling) {
    using namespace xfsampler;
    Matrix3 inv;
    if (!sourceToOutput.Invert(inv) || outWindow.IsNull()) return ImgRectI();
    if (!inv.IsAffine()) {
        // The output window's corners in the source, grown by the filter's
        // reach at the largest stretch among them (the stretch of a
        // projective map peaks at a corner of a region in front of its
        // horizon). A corner at or beyond the horizon reads without bound.
        // Scaled so that the window's centre has w > 0: all four corners
        // then have w > 0 unless the horizon crosses the window.
        Matrix3 m = inv;
        if (WOf(m, 0.5 * (outWindow.x0 + outWindow.x1), 0.5 * (outWindow.y0 + outWindow.y1)) < 0.0)
            for (double &e : m.m) e = -e;
        double X0, Y0, X1, Y1;
        if (!ProjectiveBox(m, outWindow.x0, outWindow.y0, outWindow.x1, outWindow.y1, X0, Y0, X1, Y1)) return kEndless;
        double sMax = 1.0;
        const double xs[2] = {static_cast<double>(outWindow.x0), static_cast<double>(outWindow.x1)};
        const double ys[2] = {static_cast<double>(outWindow.y0), static_cast<double>(outWindow.y1)};
        for (double x : xs)
            for (double y : ys) {
                const double w = WOf(m, x, y);
                Matrix3 local = m; // the Jacobian at (x, y): (A - p c^T) / w
                double u, v;
                m.Apply(x, y, u, v);
                for (int c = 0; c < 2; ++c) {
                    local(0, c) = (m(0, c) - u * m(2, c)) / w;
                    local(1, c) = (m(1, c) - v * m(2, c)) / w;
                }
                double sx, sy;
                TransformStretch(local, sampling.filter, sx, sy);
                sMax = std::max({sMax, sx, sy});
            }
        return CoverBox(X0, Y0, X1, Y1, ResizeFilterSupport(sampling.filter) * sMax + 0.5);
    }
    if (IsPixelPermutation(inv)) return MapCentres(outWindow, inv, 0.0, 0.0, true);
    double sx, sy;
    TransformStretch(inv, sampling.filter, sx, sy);
    const double support = ResizeFilterSupport(sampling.filter);
    // Source positions of the output pixel centres, then the taps within
    // the filter's radius of them; half a pixel more covers rounding.
    const ImgRectI centres = MapCentres(outWindow, inv, 0.0, 0.0, true);
    if (centres.IsNull()) return centres;
    const int gx = static_cast<int>(std::ceil(support * sx + 0.5)),
              gy = static_cast<int>(std::ceil(support * sy + 0.5));
    ImgRectI r = centres;
    if (!IsEndlessSide(r.x0)) r.x0 -= gx;
    if (!IsEndlessSide(r.x1)) r.x1 += gx;
    if (!IsEndlessSide(r.y0)) r.y0 -= gy;
    if (!IsEndlessSide(r.y1)) r.y1 += gy;
    return r;
}

bool TransformImage(const Image &src, Image &dst, const Matrix3 &outputToSource, const TransformSampling &sampling,
                    const std::atomic<bool> *abort) {
    using namespace xfsampler;
    if (!outputToSource.IsAffine()) {
        // Projective: the side of the source frame's centre is in front.
        Matrix3 facing;
        const ImgRectI f = src.Frame();
        if (!ProjectiveMapping::Facing(outputToSource, 0.5 * (f.x0 + f.x1), 0.5 * (f.y0 + f.y1), facing)) return false;
        return MapImage(src, dst, ProjectiveMapping(facing), sampling, abort);
    }
    dst.SetCanvasColor(src.GetCanvasColor());
    if (src.IsNoData() || dst.IsNoData() || dst.DataWindow().IsNull()) return true;
    if (!dst.AllocScanLineData()) return false;
    try {
        Job job(src, dst, outputToSource, sampling, abort);
        if (IsPixelPermutation(outputToSource) && src.Depth() == dst.Depth())
            RunCopy(job);
        else
            RunFiltered(job);
        return !job.stopped.load();
    } catch (const std::bad_alloc &) {
        return false;
    }
}

bool ProjectiveMapping::Map(double x, double y, double &u, double &v) const {
    const double w = xfsampler::WOf(m_, x, y);
    if (!(w > xfsampler::kMinW)) return false;
    u = (m_(0, 0) * x + m_(0, 1) * y + m_(0, 2)) / w;
    v = (m_(1, 0) * x + m_(1, 1) * y + m_(1, 2)) / w;
    return true;
}

void ProjectiveMapping::MapSpan(double x0, double y, int count, MappedSample *out, bool stretch) const {
    for (int i = 0; i < count; ++i) {
        MappedSample &s = out[i];
        const double x = x0 + i, w = xfsampler::WOf(m_, x, y);
        s.sx = s.sy = 1.0;
        s.ok = w > xfsampler::kMinW;
        if (!s.ok) continue;
        s.u = (m_(0, 0) * x + m_(0, 1) * y + m_(0, 2)) / w;
        s.v = (m_(1, 0) * x + m_(1, 1) * y + m_(1, 2)) / w;
        s.ok = std::isfinite(s.u) && std::isfinite(s.v);
        if (s.ok && stretch)
            FootprintStretch((m_(0, 0) - s.u * m_(2, 0)) / w, (m_(0, 1) - s.u * m_(2, 1)) / w,
                             (m_(1, 0) - s.v * m_(2, 0)) / w, (m_(1, 1) - s.v * m_(2, 1)) / w, s.sx, s.sy);
    }
}

void FootprintStretch(double dudx, double dudy, double dvdx, double dvdy, double &sx, double &sy) {
    const auto along = [](double a, double b) {
        const double s = std::sqrt(a * a + b * b);
        return std::isfinite(s) ? std::clamp(s, 1.0, MaxTransformStretch) : MaxTransformStretch;
    };
    sx = along(dudx, dudy);
    sy = along(dvdx, dvdy);
}

void PointMapping::MapSpan(double x0, double y, int count, MappedSample *out, bool stretch) const {
    for (int i = 0; i < count; ++i) {
        MappedSample &s = out[i];
        const double x = x0 + i;
        s.sx = s.sy = 1.0;
        s.ok = Map(x, y, s.u, s.v) && std::isfinite(s.u) && std::isfinite(s.v);
        if (!s.ok || !stretch) continue;
        // Central differences over one output pixel; one-sided where a neighbour has no source.
        double ux0, vx0, ux1, vx1, uy0, vy0, uy1, vy1;
        const bool l = Map(x - 0.5, y, ux0, vx0), r = Map(x + 0.5, y, ux1, vx1);
        const bool d = Map(x, y - 0.5, uy0, vy0), t = Map(x, y + 0.5, uy1, vy1);
        const double dudx = l && r ? ux1 - ux0 : r ? 2 * (ux1 - s.u) : l ? 2 * (s.u - ux0) : 0.0;
        const double dvdx = l && r ? vx1 - vx0 : r ? 2 * (vx1 - s.v) : l ? 2 * (s.v - vx0) : 0.0;
        const double dudy = d && t ? uy1 - uy0 : t ? 2 * (uy1 - s.u) : d ? 2 * (s.u - uy0) : 0.0;
        const double dvdy = d && t ? vy1 - vy0 : t ? 2 * (vy1 - s.v) : d ? 2 * (s.v - vy0) : 0.0;
        FootprintStretch(dudx, dudy, dvdx, dvdy, s.sx, s.sy);
    }
}

bool ProjectiveMapping::Facing(const Matrix3 &outputToSource, double sx, double sy, Matrix3 &out) {
    // An output point o maps to H o / w; through the inverse that source
    // point comes back with w' = 1 / w. So the output points whose source
    // lies on the side of (sx, sy) are those where w has the sign of the
    // inverse's w at (sx, sy).
    Matrix3 inv;
    out = outputToSource;
    if (!outputToSource.Invert(inv)) return false;
    const double w = xfsampler::WOf(inv, sx, sy);
    if (w == 0.0 || !std::isfinite(w)) return false;
    if (w < 0.0)
        for (double &e : out.m) e = -e;
    return true;
}

bool MapImage(const Image &src, Image &dst, const PointMapping &outputToSource, const TransformSampling &sampling,
              const std::atomic<bool> *abort) {
    using namespace xfsampler;
    dst.SetCanvasColor(src.GetCanvasColor());
    if (src.IsNoData() || dst.IsNoData() || dst.DataWindow().IsNull()) return true;
    if (!dst.AllocScanLineData()) return false;
    try {
        // The matrix is unused by the mapped path (the Job's stretch is per pixel there).
        Job job(src, dst, Matrix3::Identity(), sampling, abort);
        RunMapped(job, outputToSource);
        return !job.stopped.load();
    } catch (const std::bad_alloc &) {
        return false;
    }
}

} // namespace Orvane
