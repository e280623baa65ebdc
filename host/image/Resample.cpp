#include "host/image/Resample.h"

#include <algorithm>
#include <cmath>
#include <new>
#include <vector>

#include "host/core/Parallel.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {
namespace resample {

/// Catmull-Rom: the cubic convolution with a = -1/2.
double CatmullRom(double x) {
    x = std::fabs(x);
    if (x < 1.0) return (1.5 * x - 2.5) * x * x + 1.0;
    if (x < 2.0) return ((-0.5 * x + 2.5) * x - 4.0) * x + 2.0;
    return 0.0;
}

/// Output rows a worker filters at a time: enough to share the rows filtered
/// across between neighbouring output rows.
constexpr int kBandRows = 16;

} // namespace resample

double ResampleKernel(int filter, double x) {
    switch (filter) {
    case ResampleBilinear: return std::max(0.0, 1.0 - std::fabs(x));
    case ResampleBicubic: return resample::CatmullRom(x);
    default: return std::fabs(x) < 0.5 ? 1.0 : 0.0;
    }
}

double ResampleRadius(int filter) {
    switch (filter) {
    case ResampleBilinear: return 1.0;
    case ResampleBicubic: return 2.0;
    default: return 0.5;
    }
}

bool ResampleAxis::Build(int filter, double scale, double offset, int outStart, int outCount, int srcLo, int srcHi) {
    start_ = outStart;
    srcMin_ = srcMax_ = 0;
    first_.clear(), taps_.clear(), offset_.clear(), weights_.clear();
    if (!(scale > 0.0) || !std::isfinite(scale) || !std::isfinite(offset) || srcHi <= srcLo || outCount < 0)
        return false;
    first_.reserve(outCount), taps_.reserve(outCount), offset_.reserve(outCount);
    const double stretch = std::max(1.0, 1.0 / scale);
    const double radius = ResampleRadius(filter) * stretch;
    srcMin_ = srcHi, srcMax_ = srcLo;
    std::vector<double> w; // weights of source samples lo .. lo + w.size() - 1
    for (int i = 0; i < outCount; ++i) {
        const double u = (outStart + i + 0.5 - offset) / scale;
        int lo = 0;
        w.clear();
        if (filter == ResampleNearest) {
            lo = static_cast<int>(std::clamp(std::floor(u), static_cast<double>(srcLo), srcHi - 1.0));
            w.push_back(1.0);
        } else if (filter == ResampleBox) {
            // The footprint clipped to the range: what lies beyond is not there to average.
            const double a = std::max(u - radius, static_cast<double>(srcLo));
            const double b = std::min(u + radius, static_cast<double>(srcHi));
            if (b <= a) { // the whole footprint beyond the range: the nearest end pixel
                lo = u < srcLo ? srcLo : srcHi - 1;
                w.push_back(1.0);
            } else {
                lo = static_cast<int>(std::floor(a));
                const int hi = std::min(static_cast<int>(std::ceil(b)), srcHi);
                for (int j = lo; j < hi; ++j) w.push_back(std::max(0.0, std::min(b, j + 1.0) - std::max(a, 1.0 * j)));
            }
        } else {
            // Taps j with |j + 0.5 - u| < radius; those beyond the range fold onto its ends.
            const int j0 = static_cast<int>(std::ceil(u - radius - 0.5));
            const int j1 = static_cast<int>(std::floor(u + radius - 0.5));
            lo = std::clamp(j0, srcLo, srcHi - 1);
            const int hi = std::clamp(j1, srcLo, srcHi - 1);
            w.assign(hi - lo + 1, 0.0);
            for (int j = j0; j <= j1; ++j) {
                const double d = (j + 0.5 - u) / stretch;
                if (std::fabs(d) >= ResampleRadius(filter)) continue;
                w[std::clamp(j, srcLo, srcHi - 1) - lo] += ResampleKernel(filter, d);
            }
        }
        // Runs start and end on non-zero weights, so that a sample exactly on a
        // source pixel reads that pixel alone.
        size_t b = 0, e = w.size();
        while (b < e && w[b] == 0.0) ++b;
        while (e > b && w[e - 1] == 0.0) --e;
        double sum = 0.0;
        for (size_t k = b; k < e; ++k) sum += w[k];
        offset_.push_back(static_cast<int>(weights_.size()));
        if (b == e || std::fabs(sum) < 1e-12) { // nothing usable: the nearest pixel
            first_.push_back(std::clamp(static_cast<int>(std::floor(u)), srcLo, srcHi - 1));
            taps_.push_back(1);
            weights_.push_back(1.f);
        } else {
            first_.push_back(lo + static_cast<int>(b));
            taps_.push_back(static_cast<int>(e - b));
            for (size_t k = b; k < e; ++k) weights_.push_back(static_cast<float>(w[k] / sum));
        }
        srcMin_ = std::min(srcMin_, first_.back());
        srcMax_ = std::max(srcMax_, first_.back() + taps_.back());
    }
    if (outCount == 0) srcMin_ = srcMax_ = srcLo;
    return true;
}

bool ResampleImage(const Image &src, Image &dst, const ResampleAxis &ax, const ResampleAxis &ay,
                   const std::atomic<bool> *abort) {
    dst.SetCanvasColor(src.GetCanvasColor());
    const ImgRectI dw = dst.DataWindow();
    if (dst.IsNoData() || dw.IsNull()) return true;
    if (ax.Start() > dw.x0 || ax.Start() + ax.Count() < dw.x1 || ay.Start() > dw.y0 || ay.Start() + ay.Count() < dw.y1)
        return false;
    if (!dst.AllocScanLineData()) return false;

    const int width = dw.Width();
    // The source columns the output columns read.
    int xs0 = ax.SourceHi(), xs1 = ax.SourceLo();
    for (int i = dw.x0 - ax.Start(); i < dw.x1 - ax.Start(); ++i) {
        xs0 = std::min(xs0, ax.First(i));
        xs1 = std::max(xs1, ax.First(i) + ax.Taps(i));
    }
    std::atomic<bool> failed{false};
    auto stop = [&] {
        if ((abort && abort->load(std::memory_order_relaxed)) || src.CheckAbort() || dst.CheckAbort())
            failed.store(true, std::memory_order_relaxed);
        return failed.load(std::memory_order_relaxed);
    };
    auto band = [&](int y0, int y1) {
        // Source rows this band reads, filtered across into `across` (rows sy0..sy1-1).
        int sy0 = ay.SourceHi(), sy1 = ay.SourceLo();
        for (int y = y0; y < y1; ++y) {
            const int i = y - ay.Start();
            sy0 = std::min(sy0, ay.First(i));
            sy1 = std::max(sy1, ay.First(i) + ay.Taps(i));
        }
        std::vector<FltPixel> row(static_cast<size_t>(std::max(xs1 - xs0, 0)));
        std::vector<FltPixel> across(static_cast<size_t>(sy1 - sy0) * width);
        std::vector<FltPixel> out(width);
        for (int sy = sy0; sy < sy1; ++sy) {
            if (stop()) return;
            ReadSpanFlt(src, sy, xs0, xs1, row.data());
            FltPixel *dstRow = across.data() + static_cast<size_t>(sy - sy0) * width;
            for (int x = 0; x < width; ++x) {
                const int i = dw.x0 + x - ax.Start();
                const float *w = ax.Weights(i);
                const FltPixel *p = row.data() + (ax.First(i) - xs0);
                float r = 0.f, g = 0.f, b = 0.f, a = 0.f;
                for (int k = 0, n = ax.Taps(i); k < n; ++k) {
                    r += w[k] * p[k].R, g += w[k] * p[k].G, b += w[k] * p[k].B, a += w[k] * p[k].A;
                }
                dstRow[x] = {r, g, b, a};
            }
        }
        for (int y = y0; y < y1; ++y) {
            if (stop()) return;
            const int i = y - ay.Start();
            const float *w = ay.Weights(i);
            const FltPixel *first = across.data() + static_cast<size_t>(ay.First(i) - sy0) * width;
            const int n = ay.Taps(i);
            for (int x = 0; x < width; ++x) {
                float r = 0.f, g = 0.f, b = 0.f, a = 0.f;
                const FltPixel *p = first + x;
                for (int k = 0; k < n; ++k, p += width) {
                    r += w[k] * p->R, g += w[k] * p->G, b += w[k] * p->B, a += w[k] * p->A;
                }
                out[x] = {r, g, b, a};
            }
            StoreFlt(dst.Depth(), out.data(), width, dst.ScanLine(y));
        }
    };
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            try {
                for (int y = y0; y < y1; y += resample::kBandRows) band(y, std::min(y1, y + resample::kBandRows));
            } catch (const std::bad_alloc &) {
                failed.store(true, std::memory_order_relaxed);
            }
        },
        resample::kBandRows);
    return !failed.load();
}

} // namespace Orvane
