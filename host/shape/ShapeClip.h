#pragma once
// Boolean operations on polygons in shape units: the one adaptor over the
// Clipper library's integer polygons (scaled by 2^24, ClipperUnits.h), so
// that tools work on doubles. Every polygon is closed; filling is by the
// non-zero rule, for subject and clip alike.
//
// Use: add subject and clip paths, Execute with an operation, read the
// result; Clear to start again. Shapes go in through AppendShapePaths
// (curves flattened) and come back through ShapeOfClipPaths.
//
// Thread safety: one ShapeClipper per thread; the free functions are
// reentrant.
#include <memory>
#include <vector>

#include "host/shape/Shape.h"

namespace Orvane {

/// A closed polygon, in shape units.
using ClipPath = std::vector<ShapePoint>;
using ClipPaths = std::vector<ClipPath>;

enum class ClipOperation { Intersection, Union, Difference, Xor };

class ORVANE_API ShapeClipper {
public:
    ShapeClipper();
    ~ShapeClipper();
    ShapeClipper(const ShapeClipper &) = delete;
    ShapeClipper &operator=(const ShapeClipper &) = delete;

    /// Adds closed paths as subject (`subject` true) or clip; paths of fewer than 3 distinct points add nothing.
    void AddPaths(const ClipPaths &paths, bool subject);
    /// Runs `op` on what was added (non-zero rule on both sides) into `result` (replaced): outer contours
    /// anticlockwise, holes clockwise. False when the library fails (coordinates beyond its range).
    bool Execute(ClipOperation op, ClipPaths &result);
    /// Forgets the paths added.
    void Clear();

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

/// Appends every sub-path of `shape`, closed and flattened with steps of at most `tolerance`, to `paths`.
ORVANE_API void AppendShapePaths(const Shape &shape, ClipPaths &paths, double tolerance);
/// A shape of closed straight contours, one per path of at least 3 points.
ORVANE_API Ref<Shape> ShapeOfClipPaths(const ClipPaths &paths);
/// The area enclosed by `paths` under the non-zero rule (what they fill), in square shape units.
ORVANE_API double FilledArea(const ClipPaths &paths);

} // namespace Orvane
