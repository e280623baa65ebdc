#pragma once
// Separable resampling: the per-axis coefficient tables and the two-pass row
// job that Image::ResizeTagList and Image::ScaleOfImage run (docs/RESAMPLING.md).
//
// Coordinates. Source pixel j covers [j, j + 1) along an axis. Output pixel o
// has its centre o + 0.5 at the source position u = (o + 0.5 - offset) / scale:
// scale is output pixels per source pixel, offset (in output pixels) moves the
// output. The filters of ResizeFilters.h are read at the distance of each
// source centre j + 0.5 from u, stretched by 1 / scale when shrinking so that
// every source pixel under the output pixel takes part (area filtering).
// Nearest takes the pixel under u; box weighs each source pixel by the length
// it shares with the footprint [u - r, u + r], r = max(1, 1 / scale) / 2.
//
// Tables. An axis table gives, for each output sample, the first source index
// it reads and Taps() weights (the same count for every sample, padded with
// zeros, even, so the row loops run without per-sample branches; a padded
// tap reads a real pixel with weight 0, so an infinite or NaN source pixel
// also reaches the output samples whose padding covers it). Indices are
// not folded: they may leave the source range, and the row job reads what the
// edge policy puts there (EdgeMode through MapEdge: the canvas colour, the
// wrapped, duplicated or mirrored pixel). Weights of a sample add up to 1;
// weights below 1e-9 of the largest count as 0, so an interpolating filter on
// a source centre reads that pixel alone (a same-size resample is exact).
//
// The row job. Each worker takes a run of output rows; it turns the source
// rows those need into float, filters them across into a ring of rows (each
// source row once per run), filters down into the output row and stores it in
// the output's depth (integers round and clamp). Sums run in one fixed order,
// which the device kernels repeat: across, the even taps and the odd taps in
// two sums added at the end; down, the taps in order. So results do not depend
// on the thread count, the processor's vector width, or (for float outputs)
// whether the device made them.
//
// Thread safety: tables are values, read-only once built; ResampleImage writes
// only the output image.
#include <atomic>
#include <vector>

#include "host/image/Rect.h"
#include "host/image/ResizeFilters.h"

namespace Orvane {

class Image;
class Request;

/// An edge policy for whole-block averages (ScaleOfImage): taps beyond the
/// source range are dropped and the rest renormalised, so a block cut by the
/// range's end averages the part that exists.
constexpr int EdgeRenormalise = -1;

/// What one axis table is built from.
struct ResampleSpec {
    int filter = RszLinear;        ///< RszTypes
    int window = RszWindowHanning; ///< ResizeWindowType (sinc and Bessel)
    double scale = 1.0;            ///< output pixels per source pixel
    double offset = 0.0;           ///< output pixels
    int edges = EdgeDuplicate;     ///< EdgeMode, or EdgeRenormalise
    int srcLo = 0, srcHi = 0;      ///< the source range [srcLo, srcHi) the edge policy works on
    bool operator==(const ResampleSpec &) const = default;
};

/// The weights of one axis: output sample Start() + i (i < Count()) reads
/// source samples First(i) .. First(i) + Taps() - 1 with Weights(i).
class ORVANE_API ResampleAxis {
public:
    /// Builds the table for output samples [outStart, outStart + outCount).
    /// False (and empty) for an empty source range, a negative count, a scale
    /// that is not positive and finite, or an offset that is not finite.
    bool Build(const ResampleSpec &spec, int outStart, int outCount);

    const ResampleSpec &Spec() const { return spec_; }
    bool IsValid() const { return valid_; }
    int Start() const { return start_; }
    int Count() const { return static_cast<int>(first_.size()); }
    int Taps() const { return taps_; }
    int First(int i) const { return first_[i]; }
    const float *Weights(int i) const { return weights_.data() + static_cast<size_t>(i) * taps_; }
    /// Whether output samples [begin, end) all have rows in this table.
    bool Covers(int begin, int end) const { return begin >= end || (begin >= start_ && end <= start_ + Count()); }
    /// The source indices the samples [begin, end) read (before the edge
    /// policy maps them): [lo, hi).
    void SourceSpan(int begin, int end, int &lo, int &hi) const;

private:
    ResampleSpec spec_;
    bool valid_ = false;
    int start_ = 0, taps_ = 0;
    std::vector<int> first_;
    std::vector<float> weights_;
};

/// Fills `dst`'s data window from `src` through the two tables (x across the
/// row, y down the columns), which must cover that window. The source is read
/// as the tables' edge policies say over their source ranges; inside a range
/// but outside src's data window lies src's canvas colour. Sets dst's canvas
/// to src's. `threaded`: rows on the worker pool. Returns false on abort
/// (`abort` or either image's flag), on tables that do not cover the window,
/// or when memory ran out.
ORVANE_API bool ResampleImage(const Image &src, Image &dst, const ResampleAxis &ax, const ResampleAxis &ay,
                              const std::atomic<bool> *abort = nullptr, bool threaded = true);

/// The same job on the request's device ("ResizeAcross" and "ResizeDown" of
/// the common kernel library), giving dst a device image. False (dst
/// untouched) when there is no device or the run failed; the reason goes to
/// the task's device log and the caller runs ResampleImage.
ORVANE_API bool ResampleImageOnDevice(Request *req, const Image &src, Image &dst, const ResampleAxis &ax,
                                      const ResampleAxis &ay);

} // namespace Orvane
