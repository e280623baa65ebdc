#pragma once
// The soft band between two curves, drawn from a triangle strip.
//
// The strip alternates between the two curves: sample i of one curve, sample
// i of the other, and so on, so that every three consecutive points make one
// triangle of the band. Points are in the mask image's pixel space (x right,
// y up, row 0 at the bottom; pixel (i, j) covers [i, i + 1) x [j, j + 1), its
// centre at (i + 0.5, j + 0.5)). Vertices on the inner curve carry the value
// 1, those on the outer curve 0 (swapped by `invert`), and the value is
// interpolated linearly across each triangle.
//
// Pixels that a curve, an end of the strip or a fold touches are sampled on
// an n x n grid, the others at their centre; a sample belongs to exactly one of
// the triangles that share an edge or vertex (the top-left rule with rows
// counted upward), so a strip that tiles a region covers it exactly once.
// The band's coverage c and value v meet the mask as
//     mask = mask x (1 - c) + v
// with c clamped to 1 where folds of the strip overlap (v is then divided by
// the raw coverage, giving the mean of the overlapping layers).
//
// The mask's data window is split into at most 8 bands of rows, one worker
// call each; a band that cannot get its memory is dropped and its rows stay
// as they were. docs/MASK_BAND.md tells the whole story.
//
// Thread safety: RasterizeStrip may be called from any thread; it reads the
// strip only and writes the mask's rows, each band its own.
#include <cstddef>

#include "host/core/Export.h"
#include "host/image/Rect.h"

namespace Orvane {

class Image;
class Request;
class ThreadedOperator;

struct StripPoint {
    double x = 0.0, y = 0.0;
};

struct StripRasterOptions {
    bool innerOnEven = true; ///< the even slots of the strip hold the inner curve
    bool invert = false;     ///< 0 on the inner curve, 1 on the outer
    int subSamples = 32;     ///< n: samples per pixel side (1 preview, 8 closed solid, 32 otherwise)
    /// Take all n x n samples only in the pixels a curve, an end of the strip
    /// or a fold touches; elsewhere the pixel's centre sample stands for them
    /// (the same sums wherever one triangle covers the whole pixel).
    bool edgesOnly = true;
    /// Write into the mask directly (a closed solid line); otherwise each band
    /// draws into a temporary 16-bit band image first, then into the mask.
    bool direct = true;
    int workers = 0;                       ///< bound on the band count; 0: the pool's worker count
    const Request *request = nullptr;      ///< its render's abort flag is polled (may be null)
    ThreadedOperator *operator_ = nullptr; ///< runs the bands by its DoMultiProcess when given
};

struct StripRasterResult {
    int bands = 0;        ///< bands the data window was split into
    int droppedBands = 0; ///< bands left unchanged because their memory was refused
    bool aborted = false; ///< the render was abandoned (bands, or their later rows, may be unchanged)
    bool Ok() const { return droppedBands == 0 && !aborted; }
};

/// Bands for a data window of `height` rows with `workers` workers: the least
/// of 8, workers and height / 8, at least 1.
ORVANE_API int StripBandCount(int height, int workers);

/// The raw sums of the band over `rect` (row-major, rect.Width() floats per
/// row, bottom row first) added to `value` and `coverage`, before the clamp
/// and the blend: what one band of RasterizeStrip accumulates. Only the
/// options' innerOnEven, invert, subSamples and edgesOnly count here.
ORVANE_API void AccumulateStrip(const StripPoint *strip, size_t count, const ImgRectI &rect,
                                const StripRasterOptions &options, float *value, float *coverage);

/// Draws the band of `strip` (`count` points) into the single-channel `mask`
/// (any A depth) over its data window. Strip points beyond 2^19 pixels from
/// the origin, or not finite, drop the triangles that use them.
ORVANE_API StripRasterResult RasterizeStrip(const StripPoint *strip, size_t count, Image *mask,
                                            const StripRasterOptions &options);

} // namespace Orvane
