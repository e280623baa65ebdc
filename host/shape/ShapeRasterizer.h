#pragma once
// ShapeRasterizerInputs: anti-aliased scan conversion of a Shape into a mask
// image, each pixel getting the exact area of the shape inside it.
//
// Coordinates: pixel (i, j) is the square [i, i+1) x [j, j+1), rows counted
// from the bottom, and shape X = x / W, shape Y = y / W * yScale / xScale (W
// the image width, xScale and yScale its pixel aspect), so that one unit is
// the same length on both axes and Y runs from 0 to the image's aspect. The
// accuracy, the bands and the threads are described in docs/SHAPES.md.
//
// A tool makes one in its constructor. It adds no inputs to the tool: the
// coverage is exact area, so there is no sample count or filter to choose.
//
// Thread safety: Rasterize may run from any number of threads at once (each
// into its own image); it spreads its own work over the worker pool.
#include "host/core/Export.h"

namespace Orvane {

class Image;
class Operator;
class Request;
class Shape;

/// Fill rules of Rasterize.
enum ShapeWindingRule : int { ShapeWindingEvenOdd = 0, ShapeWindingNonZero = 1 };

class ORVANE_API ShapeRasterizerInputs {
public:
    explicit ShapeRasterizerInputs(Operator *owner) : owner_(owner) {}

    /// Fills `mask`'s data window (a single-channel image of any depth) with
    /// the coverage of `shape` under `windingRule`, or 1 - coverage when
    /// `invert`. Curves left in the shape are flattened to 1/32 pixel. `req`
    /// (may be null) gives the render whose abort stops the work. False on
    /// abort, a mask that is no single-channel image, or when memory ran out;
    /// the rows are then partly written. A mask without pixels (made for
    /// pre-calculation) succeeds at once.
    bool Rasterize(Request *req, const Shape &shape, Image *mask, bool invert, int windingRule) const;

    Operator *Owner() const { return owner_; }

private:
    Operator *owner_;
};

} // namespace Orvane
