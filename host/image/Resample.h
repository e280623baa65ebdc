#pragma once
// Separable resampling: the filters, the per-axis weight tables, and the
// two-pass row job that Image::ResizeTagList runs and the transform tools
// build on.
//
// Coordinates. Source pixel j covers [j, j + 1) along an axis. Output pixel o
// has its centre o + 0.5 at the source position u = (o + 0.5 - offset) / scale:
// scale is output pixels per source pixel, offset moves the output.
//
// Filters (radius in source pixels at scale 1):
//   Nearest   the pixel under u
//   Box       the area average of the output pixel's footprint [u - r, u + r],
//             r = max(1, 1 / scale) / 2: each source pixel weighs by the
//             length it shares with the footprint (a block average for whole
//             shrink factors)
//   Bilinear  the tent, radius 1
//   Bicubic   Catmull-Rom (the cubic with B = 0, C = 1/2), radius 2: it passes
//             through the samples, so a same-size resample is exact, and it
//             keeps straight ramps straight
// When shrinking, the tent and the cubic are stretched by 1 / scale, so that
// every source pixel under the output pixel takes part (area filtering, no
// aliasing from skipped pixels).
//
// Edges. An axis is given the source range [lo, hi) that exists; taps beyond
// it fold onto its end pixels (edge repeat), so a constant image stays
// constant up to its borders. Inside the range, pixels outside the source
// data window read as its canvas colour. Weights of a tap run always add up
// to 1, and runs start and end on non-zero weights.
//
// The row job converts source rows to float once (all depths), filters
// across, keeps the filtered rows of a band of output rows, filters down,
// and stores in the output's depth (integers round and clamp). Bands of
// output rows run in parallel; the result does not depend on the split.
//
// Thread safety: tables are values; ResampleImage writes only the output.
#include <atomic>
#include <vector>

#include "host/image/Rect.h"

namespace Orvane {

class Image;

/// Filter numbers, as the ResizeFilter tag takes them.
enum ResampleFilterKind : int { ResampleNearest = 0, ResampleBox = 1, ResampleBilinear = 2, ResampleBicubic = 3 };

/// The filter's value at distance x (in filter units; bilinear and bicubic only).
ORVANE_API double ResampleKernel(int filter, double x);
/// The filter's radius at scale 1, in source pixels.
ORVANE_API double ResampleRadius(int filter);

/// The weights of one axis: output sample i (of Count(), starting at Start())
/// reads source samples First(i) .. First(i) + Taps(i) - 1.
class ORVANE_API ResampleAxis {
public:
    /// Builds the table for output samples [outStart, outStart + outCount) from
    /// the source range [srcLo, srcHi). False (and empty) for an empty range or
    /// a scale that is not positive and finite.
    bool Build(int filter, double scale, double offset, int outStart, int outCount, int srcLo, int srcHi);

    int Start() const { return start_; }
    int Count() const { return static_cast<int>(first_.size()); }
    int First(int i) const { return first_[i]; }
    int Taps(int i) const { return taps_[i]; }
    const float *Weights(int i) const { return weights_.data() + offset_[i]; }
    /// The source samples the whole table reads: [SourceLo(), SourceHi()).
    int SourceLo() const { return srcMin_; }
    int SourceHi() const { return srcMax_; }

private:
    int start_ = 0, srcMin_ = 0, srcMax_ = 0;
    std::vector<int> first_, taps_, offset_;
    std::vector<float> weights_;
};

/// Fills `dst`'s data window from `src` through the two tables (x across the
/// row, y down the columns), which must cover that window; sets dst's canvas
/// to src's. Returns false on abort (`abort` or either image's flag) or when
/// memory ran out.
ORVANE_API bool ResampleImage(const Image &src, Image &dst, const ResampleAxis &ax, const ResampleAxis &ay,
                              const std::atomic<bool> *abort = nullptr);

} // namespace Orvane
