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
#include <new>
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

inline int64_t FloorDiv(int64_t a, int64_t b) { // b > 0
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

constexpr double kMarkMargin = 1.0 / 256; // beyond the 1/2048-pixel snap of the sample grids

/// The pixel columns whose squares, grown by kMarkMargin, meet the segment or
/// triangle of `count` (2 or 3) points in pixel row y; false when none do.
bool SlabColumns(const StripPoint *p, int count, int y, int &first, int &last) {
    const double lo = y - kMarkMargin, hi = y + 1 + kMarkMargin;
    double xa = HUGE_VAL, xb = -HUGE_VAL;
    const int edges = count == 2 ? 1 : count;
    for (int e = 0; e < edges; ++e) {
        const StripPoint &a = p[e], &b = p[(e + 1) % count];
        if (a.y == b.y) {
            if (a.y < lo || a.y > hi) continue;
            xa = std::min({xa, a.x, b.x}), xb = std::max({xb, a.x, b.x});
            continue;
        }
        double t0 = (lo - a.y) / (b.y - a.y), t1 = (hi - a.y) / (b.y - a.y);
        if (t0 > t1) std::swap(t0, t1);
        t0 = std::max(t0, 0.0), t1 = std::min(t1, 1.0);
        if (t0 > t1) continue;
        const double x0 = a.x + t0 * (b.x - a.x), x1 = a.x + t1 * (b.x - a.x);
        xa = std::min({xa, x0, x1}), xb = std::max({xb, x0, x1});
    }
    if (xa > xb) return false;
    first = static_cast<int>(std::floor(std::max(xa - kMarkMargin, -kMaxCoordinate)));
    last = static_cast<int>(std::floor(std::min(xb + kMarkMargin, kMaxCoordinate)));
    return true;
}

/// The pixels of one band where the strip's coverage or value can change
/// abruptly inside the pixel, one bit per pixel: those a curve, an end of the
/// strip, a fold or a degenerate triangle touches. Elsewhere every sample of a
/// pixel falls in the same triangles, and the centre sample alone gives the
/// pixel's sums.
class RowMarks {
public:
    bool Alloc(const ImgRectI &band) {
        band_ = band;
        words_ = (band.Width() + 63) / 64;
        try {
            bits_.assign(static_cast<size_t>(words_) * band.Height(), 0);
        } catch (const std::bad_alloc &) {
            return false;
        }
        return true;
    }

    /// Marks every pixel whose square, grown by kMarkMargin, meets the segment or
    /// triangle of `count` (2 or 3) points, in pixel space.
    void MarkFootprint(const StripPoint *p, int count) {
        double yMin = p[0].y, yMax = p[0].y;
        for (int t = 1; t < count; ++t) yMin = std::min(yMin, p[t].y), yMax = std::max(yMax, p[t].y);
        const int j0 = std::max(band_.y0, static_cast<int>(std::floor(yMin - kMarkMargin)));
        const int j1 = std::min(band_.y1 - 1, static_cast<int>(std::floor(yMax + kMarkMargin)));
        for (int j = j0; j <= j1; ++j) {
            int c0, c1;
            if (!SlabColumns(p, count, j, c0, c1)) continue;
            for (int c = std::max(c0, band_.x0); c <= std::min(c1, band_.x1 - 1); ++c) Set(j, c);
        }
    }

    /// Whether any pixel of row y in columns [x0, x1] is marked.
    bool Any(int y, int x0, int x1) const { return Next(y, x0, x1) <= x1; }

    /// The first marked column of row y in [x, last], or last + 1.
    int Next(int y, int x, int last) const {
        x = std::max(x, band_.x0);
        last = std::min(last, band_.x1 - 1);
        if (x > last) return last + 1;
        const uint64_t *row = Row(y);
        int word = (x - band_.x0) >> 6;
        const int lastWord = (last - band_.x0) >> 6;
        uint64_t bits = row[word] & (~uint64_t(0) << ((x - band_.x0) & 63));
        while (bits == 0) {
            if (++word > lastWord) return last + 1;
            bits = row[word];
        }
        const int found = band_.x0 + word * 64 + __builtin_ctzll(bits);
        return found <= last ? found : last + 1;
    }

private:
    void Set(int y, int x) { Row(y)[(x - band_.x0) >> 6] |= uint64_t(1) << ((x - band_.x0) & 63); }
    uint64_t *Row(int y) { return bits_.data() + static_cast<size_t>(y - band_.y0) * words_; }
    const uint64_t *Row(int y) const { return bits_.data() + static_cast<size_t>(y - band_.y0) * words_; }

    ImgRectI band_;
    int words_ = 0;
    std::vector<uint64_t> bits_;
};

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
    /// With `marks`, only the marked pixels take sums (`marked`), or only the others.
    BandRasterizer(const StripPoint *strip, const StripRasterOptions &options, const SampleGrid &grid,
                   const ImgRectI &band, const BandSums &sums, const RowMarks *marks = nullptr, bool marked = true)
        : strip_(strip), options_(options), grid_(grid), band_(band), buf_(sums), marks_(marks), marked_(marked) {
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
        const auto startEdges = [&](int64_t r) {
            for (int e = 0; e < 3; ++e) edges[e].Start(v[e], v[(e + 1) % 3], g, r);
        };
        startEdges(r0);

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
        // With marks: pixel rows where no marked pixel lies under the triangle are skipped.
        const bool skipRows = marks_ && marked_;
        int boxFirst = 0, boxLast = -1;
        StripPoint corners[3];
        if (skipRows) {
            boxFirst = static_cast<int>(FloorDiv(std::min({v[0].x, v[1].x, v[2].x}), g.units));
            boxLast = static_cast<int>(FloorDiv(std::max({v[0].x, v[1].x, v[2].x}), g.units));
            for (int t = 0; t < 3; ++t)
                corners[t] = {static_cast<double>(v[t].x) / g.units, static_cast<double>(v[t].y) / g.units};
        }
        const auto rowHasMarks = [&](int y) {
            if (!marks_->Any(y, boxFirst, boxLast)) return false;
            int first, last;
            return SlabColumns(corners, 3, y, first, last) && marks_->Any(y, first, last);
        };
        for (int64_t r = r0; r <= r1; ++r, ++rowStep) {
            if (rowStep == n) {
                rowStep = 0;
                ++row;
            }
            if (skipRows && (r == r0 || rowStep == 0) && !rowHasMarks(row + band_.y0)) {
                // On to the next pixel row with a mark under the box; the edges restart there.
                const int lastRow = static_cast<int>(FloorDiv(r1, n)) - band_.y0;
                do ++row;
                while (row <= lastRow && !rowHasMarks(row + band_.y0));
                if (row > lastRow) break;
                r = (row + band_.y0) * n;
                rowStep = 0;
                startEdges(r);
            }
            int64_t lo = colLo_, hi = colHi_;
            for (const EdgeBound &e : edges) e.Limit(lo, hi);
            if (lo <= hi) {
                const double y = static_cast<double>((2 * r + 1) * g.k);
                const double rowValue =
                    v[0].value + gy * (y - static_cast<double>(v[0].y)) - gx * static_cast<double>(v[0].x);
                int first = PixelOf(lo), last = PixelOf(hi);
                float *value = buf_.value + static_cast<size_t>(row) * width - band_.x0;
                float *coverage = buf_.coverage + static_cast<size_t>(row) * width - band_.x0;
                const auto add = [&](int px) {
                    const int64_t a = std::max(lo, px * n), b = std::min(hi, px * n + n - 1);
                    const double covered = static_cast<double>(b - a + 1);
                    // The value is linear along the row: the run's sum is its count times the value at its middle.
                    const double sum = covered * (rowValue + gx * static_cast<double>(a + b + 1) * k);
                    value[px] += static_cast<float>(sum * weight_);
                    coverage[px] += static_cast<float>(covered * weight_);
                };
                if (!marks_) {
                    for (int px = first; px <= last; ++px) add(px);
                } else if (!marked_) {
                    // Runs of unmarked pixels between the marked ones.
                    const int y = row + band_.y0;
                    for (int px = first; px <= last;) {
                        const int mark = marks_->Next(y, px, last);
                        for (; px < mark; ++px) add(px);
                        px = mark + 1;
                    }
                } else {
                    // The touched range narrows to the marked pixels added.
                    const int y = row + band_.y0;
                    int firstAdded = last + 1, lastAdded = first - 1;
                    for (int px = marks_->Next(y, first, last); px <= last; px = marks_->Next(y, px + 1, last)) {
                        add(px);
                        firstAdded = std::min(firstAdded, px);
                        lastAdded = px;
                    }
                    first = firstAdded, last = lastAdded;
                }
                if (buf_.rowFirst && first <= last) {
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
    const RowMarks *marks_;
    bool marked_;
    int64_t rowLo_, rowHi_, colLo_, colHi_;
    int shift_ = -1; ///< log2 n when n is a power of 2 (columns to pixels by a shift)
    double weight_;
};

/// Whether every point of the strip is finite and within reach of the grids.
bool AllPointsUsable(const StripPoint *strip, size_t count) {
    for (size_t i = 0; i < count; ++i)
        if (!(std::fabs(strip[i].x) <= kMaxCoordinate && std::fabs(strip[i].y) <= kMaxCoordinate)) return false;
    return true;
}

double TwiceArea(const StripPoint *p) {
    return (p[1].x - p[0].x) * (p[2].y - p[0].y) - (p[2].x - p[0].x) * (p[1].y - p[0].y);
}

/// The strip's triangles alternate in orientation where they tile without
/// folding; +1 when the even ones turn counter-clockwise over most of the
/// strip's area, else -1.
int StripOrientation(const StripPoint *strip, size_t count) {
    double sum = 0.0;
    for (size_t i = 0; i + 2 < count; ++i) sum += (i % 2 == 0 ? 1.0 : -1.0) * TwiceArea(strip + i);
    return sum >= 0.0 ? 1 : -1;
}

/// Marks the pixels of a band where the band's boundary runs: both curves
/// (every segment i, i + 2), the two ends (a closed strip's ends coincide and
/// are marked all the same), and the whole of every triangle that folds back
/// against the strip's orientation, has no area, or is steep: narrower than
/// kSteepWidth pixels from its lone vertex to its side on the other curve, so
/// that its value changes by more than 1/kSteepWidth across a pixel. Where
/// the value bends between two shallow triangles inside a pixel, its centre
/// is then off the mean of its samples by at most about 1/(4 kSteepWidth).
void MarkEdgePixels(const StripPoint *strip, size_t count, RowMarks &marks) {
    constexpr double kSteepWidth = 16.0;
    const int orientation = StripOrientation(strip, count);
    for (size_t i = 0; i + 2 < count; ++i) {
        const StripPoint segment[2] = {strip[i], strip[i + 2]};
        marks.MarkFootprint(segment, 2);
        const double area = TwiceArea(strip + i) * (i % 2 == 0 ? 1.0 : -1.0) * orientation;
        const double side = std::hypot(strip[i + 2].x - strip[i].x, strip[i + 2].y - strip[i].y);
        if (!(area > 0.0) || area < kSteepWidth * side) marks.MarkFootprint(strip + i, 3);
    }
    marks.MarkFootprint(strip, 2);
    marks.MarkFootprint(strip + count - 2, 2);
}

/// Adds the strip's triangles to one band's sums; false when `aborted()` said
/// so. With `edgesOnly`, the pixels left unmarked take their centre sample and
/// the marked ones all n x n samples.
template <class AbortCheck> bool AccumulateBand(const StripPoint *strip, size_t count,
                                                const StripRasterOptions &options, const SampleGrid &grid,
                                                const ImgRectI &band, const BandSums &sums, const AbortCheck &aborted) {
    const auto addAll = [&](BandRasterizer &raster) {
        for (size_t i = 0; i + 2 < count; ++i) {
            if (i % kTrianglesPerAbortPoll == 0 && aborted()) return false;
            raster.AddTriangle(i);
        }
        return true;
    };
    RowMarks marks;
    if (!options.edgesOnly || grid.n == 1 || !AllPointsUsable(strip, count) || !marks.Alloc(band)) {
        BandRasterizer raster(strip, options, grid, band, sums);
        return addAll(raster);
    }
    MarkEdgePixels(strip, count, marks);
    const SampleGrid centreGrid(1);
    BandRasterizer centres(strip, options, centreGrid, band, sums, &marks, false);
    if (!addAll(centres)) return false;
    BandRasterizer samples(strip, options, grid, band, sums, &marks);
    return addAll(samples);
}

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

/// dst = dst x (1 - coverage) + value over the covered columns among
/// first..last of one band row, where `valueRow` (if not null, from column
/// first on) replaces the band's own values.
void BlendRow(Image &dst, int y, int first, int last, const float *coverage, const float *value,
              const FltPixel *valueRow, FltPixel *work) {
    const ImgRectI &w = dst.DataWindow();
    uint8_t *line = dst.ScanLine(y);
    const size_t pixelBytes = dst.BytesPerPixel();
    // Only the runs the band covers: a ring's hole is left alone.
    for (int x = first; x <= last;) {
        while (x <= last && coverage[x] == 0.f) ++x;
        const int runFirst = x;
        while (x <= last && coverage[x] != 0.f) ++x;
        const int count = x - runFirst;
        if (count == 0) break;
        uint8_t *row = line + static_cast<size_t>(runFirst - w.x0) * pixelBytes;
        LoadFlt(dst.Depth(), row, count, work);
        for (int i = 0; i < count; ++i) {
            float c, v;
            FoldedSample(coverage[runFirst + i], value[runFirst + i], c, v);
            if (valueRow) v = valueRow[runFirst - first + i].A;
            work[i].A = work[i].A * (1.f - c) + v;
        }
        StoreFlt(dst.Depth(), work, count, row);
    }
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

    if (!AccumulateBand(job.strip, job.count, job.options, job.grid, band,
                        {buf.value, buf.coverage, buf.rowFirst, buf.rowLast}, [&job] { return job.Aborted(); }))
        return BandOutcome::Aborted;

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
    AccumulateBand(strip, count, options, grid, rect, {value, coverage}, [] { return false; });
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
