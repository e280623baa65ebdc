// The band rasteriser: triangles of a strip scan-converted on an exact
// fixed-point sub-sample grid, band by band of rows.
//
// Positions are snapped to a grid of U = 2nK units per pixel, chosen so that
// every sub-sample position is a whole number of units: sample column j (of
// all columns, j = pixel x n + s) sits at x = (2j + 1)K units, that is at
// pixel-space x = (j + 0.5) / n, and the same for rows. Edge functions are
// then exact 64-bit integers, two triangles sharing an edge see exactly
// opposite values, and the ownership rule decides every sample on the edge
// once. Along a sample row each edge bounds the covered columns by
// floor(c / m), walked from row to row without division.
#include "host/shape/StripRasterizer.h"

#include <algorithm>
#include <atomic>
#include <climits>
#include <cmath>
#include <cstdint>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/Operator.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/image/PixelMemory.h"

namespace Orvane {
namespace stripraster {

constexpr int kMaxBands = 8;
constexpr int kMaxSubSamples = 256;
constexpr double kMaxCoordinate = 524288.0; // 2^19 pixels: keeps edge functions inside 2^62
constexpr int kTrianglesPerAbortPoll = 256;

int64_t FloorDiv(int64_t a, int64_t b) { // b > 0
    const int64_t q = a / b;
    return (a % b != 0 && a < 0) ? q - 1 : q;
}

/// The fixed-point sub-sample grid of n x n samples per pixel.
struct SampleGrid {
    int n;
    int64_t k;     ///< half the distance between sample columns, in units
    int64_t units; ///< units per pixel, 2nK (at least 1024)
    explicit SampleGrid(int samples)
        : n(samples), k(std::max<int64_t>(1, (1024 + 2 * samples - 1) / (2 * samples))), units(2 * samples * k) {}
    int64_t Snap(double v) const { return std::llround(v * static_cast<double>(units)); }
    /// First and last sample index (row or column) whose position lies in [lo, hi] units.
    int64_t FirstAtOrAbove(int64_t lo) const { return -FloorDiv(-(lo - k), 2 * k); }
    int64_t LastAtOrBelow(int64_t hi) const { return FloorDiv(hi - k, 2 * k); }
};

SampleGrid GridOf(const StripRasterOptions &options) {
    return SampleGrid(std::clamp(options.subSamples, 1, kMaxSubSamples));
}

struct Vertex {
    int64_t x, y;
    double value;
};

/// One edge P->Q of a counter-clockwise triangle as the bound it puts on the
/// sample columns of each sample row. Inside means E + bias >= 0 with
/// E(p) = A (p.x - P.x) + B (p.y - P.y), A = P.y - Q.y, B = Q.x - P.x; an
/// edge owns the samples exactly on it when A > 0, or A = 0 and B > 0 (left
/// edges and, with rows counted upward, bottom edges), which holds for exactly
/// one of the two triangles sharing it. At sample (j, r): E + bias = a j + c_r.
struct EdgeBound {
    int sense = 0; ///< +1 lower bound j >= -floor(c/m); -1 upper bound j <= floor(c/m); 0 whole row by sign of c
    int64_t m = 1, q = 0, rem = 0, dq = 0, dr = 0, c = 0, dc = 0;

    void Start(const Vertex &p, const Vertex &qv, const SampleGrid &g, int64_t row) {
        const int64_t A = p.y - qv.y, B = qv.x - p.x;
        const int64_t bias = (A > 0 || (A == 0 && B > 0)) ? 0 : -1;
        const int64_t a = 2 * A * g.k;
        dc = 2 * B * g.k;
        c = A * (g.k - p.x) + B * (g.k - p.y) + bias + dc * row;
        sense = a > 0 ? 1 : (a < 0 ? -1 : 0);
        if (sense == 0) return;
        m = a > 0 ? a : -a;
        q = FloorDiv(c, m);
        rem = c - q * m;
        dq = FloorDiv(dc, m);
        dr = dc - dq * m;
    }
    void Next() {
        if (sense == 0) {
            c += dc;
            return;
        }
        q += dq;
        rem += dr;
        if (rem >= m) {
            ++q;
            rem -= m;
        }
    }
    /// Narrows [lo, hi] to the columns this edge lets in on the current row.
    void Limit(int64_t &lo, int64_t &hi) const {
        if (sense > 0)
            lo = std::max(lo, -q);
        else if (sense < 0)
            hi = std::min(hi, q);
        else if (c < 0)
            hi = lo - 1;
    }
};

/// The memory of one band: value and coverage per pixel, the touched column
/// range per row, and two rows of pixels for the blend.
struct BandBuffers {
    uint8_t *block = nullptr;
    size_t bytes = 0;
    float *value = nullptr, *coverage = nullptr;
    int *rowFirst = nullptr, *rowLast = nullptr;
    FltPixel *row = nullptr, *bandRow = nullptr;

    bool Alloc(int width, int height) {
        const size_t cells = static_cast<size_t>(width) * height;
        bytes = cells * 2 * sizeof(float) + static_cast<size_t>(height) * 2 * sizeof(int) +
                static_cast<size_t>(width) * 2 * sizeof(FltPixel);
        block = AllocPixels(bytes);
        if (!block) return false;
        value = reinterpret_cast<float *>(block);
        coverage = value + cells;
        rowFirst = reinterpret_cast<int *>(coverage + cells);
        rowLast = rowFirst + height;
        row = reinterpret_cast<FltPixel *>(rowLast + height);
        bandRow = row + width;
        std::fill(rowFirst, rowFirst + height, INT_MAX);
        std::fill(rowLast, rowLast + height, INT_MIN);
        return true;
    }
    ~BandBuffers() {
        if (block) FreePixels(block, bytes);
    }
};

enum class BandOutcome { Done, Dropped, Aborted };

/// Everything the bands share read-only.
struct StripJob {
    const StripPoint *strip;
    size_t count;
    Image *mask;
    const StripRasterOptions &options;
    SampleGrid grid;
    ImgRectI window;
    int bands;
    const std::atomic<bool> *abortFlag;

    bool Aborted() const { return (abortFlag && abortFlag->load(std::memory_order_relaxed)) || mask->CheckAbort(); }
};

/// Where one band's sums go: value and coverage per pixel of the band (rows
/// of band width), and optionally the touched column range per row.
struct BandSums {
    float *value, *coverage;
    int *rowFirst = nullptr, *rowLast = nullptr;
};

/// Scan-converts strip triangles into one band's sums.
class BandRasterizer {
public:
    BandRasterizer(const StripPoint *strip, const StripRasterOptions &options, const SampleGrid &grid,
                   const ImgRectI &band, const BandSums &sums)
        : strip_(strip), options_(options), grid_(grid), band_(band), buf_(sums) {
        const int64_t n = grid.n;
        rowLo_ = band.y0 * n;
        rowHi_ = band.y1 * n - 1;
        colLo_ = band.x0 * n;
        colHi_ = band.x1 * n - 1;
        weight_ = 1.0 / (static_cast<double>(n) * n);
        if ((n & (n - 1)) == 0)
            for (shift_ = 0; (int64_t(1) << shift_) < n; ++shift_) {
            }
    }

    /// Adds the triangle of strip points i, i + 1, i + 2.
    void AddTriangle(size_t i) {
        const StripPoint *p = strip_ + i;
        if (!Visible(p)) return;
        const bool invert = options_.invert;
        Vertex v[3];
        for (int t = 0; t < 3; ++t) {
            const bool inner = ((i + t) % 2 == 0) == options_.innerOnEven;
            v[t] = {grid_.Snap(p[t].x), grid_.Snap(p[t].y), inner != invert ? 1.0 : 0.0};
        }
        int64_t area2 = (v[1].x - v[0].x) * (v[2].y - v[0].y) - (v[2].x - v[0].x) * (v[1].y - v[0].y);
        if (area2 == 0) return;
        if (area2 < 0) {
            std::swap(v[1], v[2]);
            area2 = -area2;
        }
        Scan(v, static_cast<double>(area2));
    }

private:
    /// Cohen-Sutherland outcodes against the band: false when all three points
    /// lie beyond one side of it, or a point is unusable.
    bool Visible(const StripPoint *p) const {
        int all = 0xf;
        for (int t = 0; t < 3; ++t) {
            const double x = p[t].x, y = p[t].y;
            if (!(std::fabs(x) <= kMaxCoordinate && std::fabs(y) <= kMaxCoordinate)) return false;
            const int code =
                (x < band_.x0 ? 1 : 0) | (x > band_.x1 ? 2 : 0) | (y < band_.y0 ? 4 : 0) | (y > band_.y1 ? 8 : 0);
            all &= code;
        }
        return all == 0;
    }

    void Scan(const Vertex *v, double area2) {
        const SampleGrid &g = grid_;
        const int64_t yMin = std::min({v[0].y, v[1].y, v[2].y}), yMax = std::max({v[0].y, v[1].y, v[2].y});
        const int64_t r0 = std::max(rowLo_, g.FirstAtOrAbove(yMin)), r1 = std::min(rowHi_, g.LastAtOrBelow(yMax));
        if (r0 > r1) return;

        EdgeBound edges[3];
        for (int e = 0; e < 3; ++e) edges[e].Start(v[e], v[(e + 1) % 3], g, r0);

        // The value as a plane over unit positions, taken from the first vertex.
        const double dx1 = static_cast<double>(v[1].x - v[0].x), dy1 = static_cast<double>(v[1].y - v[0].y);
        const double dx2 = static_cast<double>(v[2].x - v[0].x), dy2 = static_cast<double>(v[2].y - v[0].y);
        const double dv1 = v[1].value - v[0].value, dv2 = v[2].value - v[0].value;
        const double gx = (dv1 * dy2 - dv2 * dy1) / area2, gy = (dx1 * dv2 - dx2 * dv1) / area2;
        const double k = static_cast<double>(g.k);

        const int64_t n = g.n;
        const int width = band_.Width();
        int row = static_cast<int>(FloorDiv(r0, n)) - band_.y0; // the pixel row of sample row r
        int64_t rowStep = r0 - (row + band_.y0) * n;
        for (int64_t r = r0; r <= r1; ++r, ++rowStep) {
            if (rowStep == n) {
                rowStep = 0;
                ++row;
            }
            int64_t lo = colLo_, hi = colHi_;
            for (const EdgeBound &e : edges) e.Limit(lo, hi);
            if (lo <= hi) {
                const double y = static_cast<double>((2 * r + 1) * g.k);
                const double rowValue =
                    v[0].value + gy * (y - static_cast<double>(v[0].y)) - gx * static_cast<double>(v[0].x);
                const int first = PixelOf(lo), last = PixelOf(hi);
                float *value = buf_.value + static_cast<size_t>(row) * width - band_.x0;
                float *coverage = buf_.coverage + static_cast<size_t>(row) * width - band_.x0;
                for (int px = first; px <= last; ++px) {
                    const int64_t a = std::max(lo, px * n), b = std::min(hi, px * n + n - 1);
                    const double covered = static_cast<double>(b - a + 1);
                    // The value is linear along the row: the run's sum is its count times the value at its middle.
                    const double sum = covered * (rowValue + gx * static_cast<double>(a + b + 1) * k);
                    value[px] += static_cast<float>(sum * weight_);
                    coverage[px] += static_cast<float>(covered * weight_);
                }
                if (buf_.rowFirst) {
                    buf_.rowFirst[row] = std::min(buf_.rowFirst[row], first);
                    buf_.rowLast[row] = std::max(buf_.rowLast[row], last);
                }
            }
            for (EdgeBound &e : edges) e.Next();
        }
    }

    /// The pixel column of sample column j (j within the band's columns).
    int PixelOf(int64_t j) const {
        const int64_t offset = j - colLo_;
        return band_.x0 + static_cast<int>(shift_ >= 0 ? offset >> shift_ : offset / grid_.n);
    }

    const StripPoint *strip_;
    const StripRasterOptions &options_;
    const SampleGrid &grid_;
    ImgRectI band_;
    BandSums buf_;
    int64_t rowLo_, rowHi_, colLo_, colHi_;
    int shift_ = -1; ///< log2 n when n is a power of 2 (columns to pixels by a shift)
    double weight_;
};

/// Coverage clamped to 1 and the value scaled with it, so overlapping folds
/// give the mean of their layers.
inline void FoldedSample(float coverage, float value, float &c, float &v) {
    c = coverage;
    v = value;
    if (c > 1.f) {
        v /= c;
        c = 1.f;
    }
}

/// dst = dst x (1 - coverage) + value over columns first..last of one band row,
/// where `valueRow` (if not null, from column first on) replaces the band's own values.
void BlendRow(Image &dst, int y, int first, int last, const float *coverage, const float *value,
              const FltPixel *valueRow, FltPixel *work) {
    const ImgRectI &w = dst.DataWindow();
    const int count = last - first + 1;
    uint8_t *row = dst.ScanLine(y) + static_cast<size_t>(first - w.x0) * dst.BytesPerPixel();
    LoadFlt(dst.Depth(), row, count, work);
    for (int i = 0; i < count; ++i) {
        float c, v;
        FoldedSample(coverage[first + i], value[first + i], c, v);
        if (valueRow) v = valueRow[i].A;
        work[i].A = work[i].A * (1.f - c) + v;
    }
    StoreFlt(dst.Depth(), work, count, row);
}

BandOutcome RunBand(const StripJob &job, int k) {
    const ImgRectI &win = job.window;
    const int h = win.Height();
    const ImgRectI band(win.x0, win.y0 + static_cast<int>(static_cast<int64_t>(h) * k / job.bands), win.x1,
                        win.y0 + static_cast<int>(static_cast<int64_t>(h) * (k + 1) / job.bands));
    if (band.Height() <= 0) return BandOutcome::Done;
    if (job.Aborted()) return BandOutcome::Aborted;
    BandBuffers buf;
    if (!buf.Alloc(band.Width(), band.Height())) return BandOutcome::Dropped;

    BandRasterizer raster(job.strip, job.options, job.grid, band, {buf.value, buf.coverage, buf.rowFirst, buf.rowLast});
    for (size_t i = 0; i + 2 < job.count; ++i) {
        if (i % kTrianglesPerAbortPoll == 0 && job.Aborted()) return BandOutcome::Aborted;
        raster.AddTriangle(i);
    }

    // Through a band image: the band over a cleared 16-bit image first (its
    // own value, rounded to 16 bits), then that image into the mask.
    Ref<Image> bandImage;
    if (!job.options.direct) {
        bandImage = NewImageTagList({{ImgWidth, job.mask->Width()},
                                     {ImgHeight, job.mask->Height()},
                                     {ImgDepth, DepthAInt16},
                                     {ImgDataWindow, &band}});
        if (!bandImage || !bandImage->AllocScanLineData()) return BandOutcome::Dropped;
    }
    const int width = band.Width();
    for (int row = 0; row < band.Height(); ++row) {
        if (job.Aborted()) return BandOutcome::Aborted;
        const int first = buf.rowFirst[row], last = buf.rowLast[row];
        if (first > last) continue;
        const int y = band.y0 + row;
        const float *coverage = buf.coverage + static_cast<size_t>(row) * width - band.x0;
        const float *value = buf.value + static_cast<size_t>(row) * width - band.x0;
        const FltPixel *bandValues = nullptr;
        if (bandImage) {
            BlendRow(*bandImage, y, first, last, coverage, value, nullptr, buf.row);
            LoadFlt(DepthAInt16, bandImage->PixelAddress(first, y), last - first + 1, buf.bandRow);
            bandValues = buf.bandRow;
        }
        BlendRow(*job.mask, y, first, last, coverage, value, bandValues, buf.row);
    }
    return BandOutcome::Done;
}

} // namespace stripraster

using namespace stripraster;

int StripBandCount(int height, int workers) { return std::max(1, std::min({kMaxBands, workers, height / 8})); }

void AccumulateStrip(const StripPoint *strip, size_t count, const ImgRectI &rect, const StripRasterOptions &options,
                     float *value, float *coverage) {
    if (!strip || rect.IsNull()) return;
    const SampleGrid grid = GridOf(options);
    BandRasterizer raster(strip, options, grid, rect, {value, coverage});
    for (size_t i = 0; i + 2 < count; ++i) raster.AddTriangle(i);
}

StripRasterResult RasterizeStrip(const StripPoint *strip, size_t count, Image *mask,
                                 const StripRasterOptions &options) {
    StripRasterResult result;
    if (!mask || !mask->IsMask() || mask->DataWindow().IsNull()) return result;
    const int workers = options.workers > 0 ? options.workers : WorkerCount();
    result.bands = StripBandCount(mask->DataWindow().Height(), workers);
    if (!strip || count < 3) return result;
    if (!mask->HasScanLineData() && !mask->AllocScanLineData()) {
        result.droppedBands = result.bands;
        return result;
    }
    const RenderTask *task = options.request ? options.request->GetTask() : nullptr;
    const StripJob job{strip,
                       count,
                       mask,
                       options,
                       GridOf(options),
                       mask->DataWindow(),
                       result.bands,
                       task ? task->AbortFlag() : nullptr};

    std::vector<BandOutcome> outcomes(result.bands, BandOutcome::Done);
    const auto runBand = [&job, &outcomes](int k) { outcomes[k] = RunBand(job, k); };
    if (options.operator_)
        options.operator_->DoMultiProcess(runBand, result.bands);
    else
        ParallelFor(result.bands, runBand);

    for (BandOutcome o : outcomes) {
        if (o == BandOutcome::Dropped) ++result.droppedBands;
        if (o == BandOutcome::Aborted) result.aborted = true;
    }
    return result;
}

} // namespace Orvane
