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
// ShapeCoverage is the scan converter underneath, for callers that put the
// coverage to other uses (the shape tree renderer composites colours with it):
// one or more shapes placed in pixels once, then swept band by band.
//
// Thread safety: Rasterize may run from any number of threads at once (each
// into its own image); it spreads its own work over the worker pool. A
// ShapeCoverage is built by one thread, then read by any number; each thread
// sweeps with its own ShapeCoverage::Band.
#include <memory>
#include <utility>
#include <vector>

#include "host/core/Export.h"
#include "host/image/Rect.h"

namespace Orvane {

class Image;
class Operator;
class Request;
class Shape;

/// Fill rules of Rasterize.
enum ShapeWindingRule : int { ShapeWindingEvenOdd = 0, ShapeWindingNonZero = 1 };

/// Shapes flattened and placed in pixels (the mapping above), from which the
/// exact-area coverage of any band of rows is swept.
class ORVANE_API ShapeCoverage {
public:
    /// `xScale`, `yScale`: pixels per shape unit along each axis (the image
    /// width, and the width times XScale over YScale).
    ShapeCoverage(double xScale, double yScale);
    ~ShapeCoverage();
    ShapeCoverage(ShapeCoverage &&) noexcept;
    ShapeCoverage &operator=(ShapeCoverage &&) noexcept;

    /// Adds the shape's sub-paths, curves flattened to 1-pixel steps.
    /// `oriented`: the shape is turned, where its signed area is negative, so
    /// that shapes added this way fill their union under the non-zero rule
    /// rather than cancelling where they wind opposite ways. Throws
    /// std::bad_alloc.
    void Add(const Shape &shape, bool oriented);
    /// Nothing with area was added.
    bool IsEmpty() const;
    /// The pixels the added paths may cover (null when empty).
    ImgRectI PixelBox() const;

    /// The cells of one band of rows, reused band after band.
    class ORVANE_API Band {
    public:
        Band();
        ~Band();
        Band(const Band &) = delete;
        Band &operator=(const Band &) = delete;
        /// Gathers the edges of `coverage` inside `box` (pixels); the rows and
        /// columns of `box` may then be swept. False when the band needs more
        /// cells than one band may hold. Throws std::bad_alloc.
        bool Build(const ShapeCoverage &coverage, const ImgRectI &box);
        /// Writes the coverage of row `y` over columns [x0, x1) (inside the
        /// built box) to `out` under `windingRule`, 1 - coverage when `invert`.
        void Sweep(int y, int x0, int x1, int windingRule, bool invert, float *out) const;
        /// The same without invert, for callers that skip what is not covered: only the pixels of non-zero
        /// coverage are written, and `spans` (replaced) lists their stretches of columns [begin, end), in order.
        void SweepSpans(int y, int x0, int x1, int windingRule, float *out,
                        std::vector<std::pair<int, int>> &spans) const;

    private:
        struct Cells;
        std::unique_ptr<Cells> cells_;
    };

private:
    struct Path;
    std::unique_ptr<Path> path_;
};

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
