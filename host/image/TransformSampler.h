#pragma once
// The general transform sampler: fills an image's data window from a source
// image through an affine or projective mapping of output positions to
// source positions, with the reconstruction filters of ResizeFilters.h.
// Projective mappings resample through PointMapping.h (per pixel divide by
// w, stretch from the local Jacobian); the rest of this comment is about
// the affine paths.
//
// Coordinates. Pixel (i, j) covers [i, i + 1) x [j, j + 1), rows counted from
// the bottom, in both images. Output pixel (i, j) takes the source position
// (u, v) = outputToSource * (i + 0.5, j + 0.5); source pixel k along an axis
// weighs F((k + 0.5 - u) / s), where F is the filter and s its stretch.
//
// Footprint. With J the linear part of outputToSource, one output pixel step
// moves u by up to |(J00, J01)| and v by up to |(J10, J11)|. Where that is
// above 1 (shrinking), the filter along that source axis is stretched by it,
// so every source pixel under the output pixel takes part and minification
// does not alias; rotations and enlargements keep s = 1. Nearest never
// stretches. The stretch is capped at MaxTransformStretch.
//
// Edges. Canvas: beyond the source's data window lies its canvas colour (the
// data window may reach past the frame). Wrap, Duplicate, Mirror: positions
// beyond the source frame fold back into it (MapEdge over the frame), and
// inside the frame, pixels outside the data window are canvas.
//
// Weights of each axis are divided by their sum, so a constant image stays
// constant. Results are computed in float per pixel and stored in the
// output's depth (integers round to nearest).
//
// Exact paths. When the mapping sends pixel centres onto pixel centres by a
// signed permutation of the axes (integer moves, flips about pixel borders,
// quarter turns), pixels are copied as they are, whatever the filter; a
// diagonal mapping (scale, move, flip) computes its weights once per column
// and once per row; anything else computes them per pixel.
//
// Thread safety: rows run in parallel on the worker pool; the source is only
// read, and each worker writes rows of its own.
#include <atomic>

#include "host/image/Matrix3.h"
#include "host/image/Rect.h"
#include "host/image/ResizeFilters.h"

namespace Orvane {

class Image;

/// How a transform resamples.
struct TransformSampling {
    int filter = RszLinear;        ///< RszTypes
    int window = RszWindowHanning; ///< ResizeWindowType (sinc, Bessel)
    int edges = EdgeCanvas;        ///< EdgeMode
    bool operator==(const TransformSampling &) const = default;
};

/// Largest filter stretch the sampler applies (shrinking further than this
/// samples as if shrinking by this much).
constexpr double MaxTransformStretch = 256.0;

/// Whether `outputToSource` sends pixel centres onto pixel centres by a
/// signed permutation of the axes (within 1e-9); the copy path then applies.
ORVANE_API bool IsPixelPermutation(const Matrix3 &outputToSource);

/// The filter stretch along the source's x and y axes for a mapping (1 when
/// not shrinking; never above MaxTransformStretch).
ORVANE_API void TransformStretch(const Matrix3 &outputToSource, int filter, double &sx, double &sy);

/// The output window whose pixels `srcWindow` (of a source of frame
/// `srcFrame`) reaches through `sourceToOutput` with `sampling`: the moved
/// window grown by the filter's reach, exactly the moved window on the copy
/// path. Endless sides stay endless where the mapping keeps the axes apart
/// (any rotation makes every side endless); edges other than Canvas define
/// every position, so the result is endless then. A singular mapping gives
/// a null window. Projective: the moved corners of the grown window plus the
/// filter's reach; endless when a corner reaches the horizon.
ORVANE_API ImgRectI TransformedWindow(const ImgRectI &srcWindow, const Matrix3 &sourceToOutput,
                                      const TransformSampling &sampling);

/// The source window that output pixels of `outWindow` read through
/// `sourceToOutput` with `sampling` (Canvas edges; other edges may read the
/// whole frame). Null for a singular mapping. Projective: the corners'
/// box grown by the reach at the largest stretch among the corners; endless
/// when a corner lies at or beyond the horizon.
ORVANE_API ImgRectI TransformSourceWindow(const ImgRectI &outWindow, const Matrix3 &sourceToOutput,
                                          const TransformSampling &sampling);

/// Fills `dst`'s data window from `src` (any depth; `dst` any depth, though
/// the copy path keeps bytes only when both depths agree) through
/// `outputToSource`. A projective mapping shows the side of its horizon
/// where the source frame's centre lies; beyond it is canvas. Sets dst's
/// canvas to src's. False on abort (`abort`, or either image's flag), for a
/// singular projective mapping, or when memory ran out; an image without rows on either side
/// (pre-calculation) does nothing and succeeds.
ORVANE_API bool TransformImage(const Image &src, Image &dst, const Matrix3 &outputToSource,
                               const TransformSampling &sampling, const std::atomic<bool> *abort = nullptr);

} // namespace Orvane
