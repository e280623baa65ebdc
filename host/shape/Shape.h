#pragma once
// Shape: a vector path for masks. One or more sub-paths of straight segments
// and cubic Bezier curves, each open or closed, and what masks do with them:
// flattening, uniform B-splines, stroking (outline) and offsetting (expand).
//
// Coordinates are doubles in any space the caller chooses; masks use X 0..1
// over the image width and Y 0..aspect (ShapeRasterizer.h). Filling treats
// every sub-path as closed and lets the fill rule decide what a hole is;
// stroking honours open and closed. docs/SHAPES.md has the model, the tags,
// the integer scale of the offsetter and its joins and caps.
//
// Ownership: reference counted (Ref<Shape>, MakeRef<Shape>()); the *Of*
// operations give new shapes and leave this one alone.
//
// Thread safety: a Shape is built by one thread; once built, const calls are
// safe from any number of threads.
#include <vector>

#include "host/core/Object.h"
#include "host/core/TagList.h"
#include "host/image/Matrix3.h"

namespace Orvane {

struct ShapePoint {
    double x = 0.0, y = 0.0;
    constexpr bool operator==(const ShapePoint &) const = default;
};

/// Bounding box; empty (x1 < x0) for a shape without points.
struct ShapeBox {
    double x0 = 1.0, y0 = 1.0, x1 = 0.0, y1 = 0.0;
    constexpr bool IsEmpty() const { return x1 < x0 || y1 < y0; }
};

/// Values of ShapeJoin and ShapeCap (Tags.h).
enum ShapeJoinKind : int { ShapeJoinBevel = 0, ShapeJoinMiter = 1, ShapeJoinRound = 2, ShapeJoinMiterClip = 3 };
enum ShapeCapKind : int { ShapeCapFlat = 0, ShapeCapSquare = 1, ShapeCapRound = 2 };

/// Flattening tolerance (the longest step) when a tag list gives none.
constexpr double ShapeDefaultTolerance = 1.0 / 4096.0;
/// Miter limit (miter length over stroke width) when a tag list gives none.
constexpr double ShapeDefaultMiterLimit = 4.0;

class ORVANE_API Shape : public RefObject {
public:
    struct Vertex {
        double x, y;
        bool control; ///< one of the two control points before a cubic's end point
    };
    struct SubPath {
        std::vector<Vertex> points; ///< starts with an on-curve point
        bool closed = false;
    };

    // ---- building ----
    /// Starts a new sub-path at (x, y).
    void MoveTo(double x, double y);
    /// A straight segment; without an open sub-path it starts one at (x, y).
    void LineTo(double x, double y);
    /// A cubic curve with control points c1, c2 to (x, y); starts a sub-path
    /// at (x, y) when none is open.
    void BezierTo(double c1x, double c1y, double c2x, double c2y, double x, double y);
    /// Closes the open sub-path (no effect without one). Segments after it
    /// start a new sub-path at the closed one's first point.
    void Close();
    /// Appends copies of `other`'s sub-paths (a hole is just another one).
    void AddShape(const Shape &other);
    /// Appends the uniform cubic B-spline of `n` control points, flattened
    /// with ShapeTolerance, to the open sub-path (joined by a line from its
    /// current point) or to a new one. Closed: the curve wraps around and
    /// ends where it began (Close stays the caller's). Open: each end gets a
    /// control point beyond it, the next one mirrored through the end (2 P0 -
    /// P1), so the curve starts at the first control point and ends at the
    /// last, in n - 1 pieces: the same curve as an open BSplinePolyLine.
    void FlatBSplineTo(const ShapePoint *points, int n, bool closed, const TagList &tags);
    /// The rational form: control point i has weight weights[i] (positive;
    /// smaller ones count as 1e-9). All weights 1 give FlatBSplineTo's curve.
    void FlatTBSplineTo(const ShapePoint *points, const double *weights, int n, bool closed, const TagList &tags);

    // ---- reading ----
    /// Points of all sub-paths, control points included.
    int GetCount() const;
    bool IsEmpty() const { return GetCount() == 0; }
    /// The first point of the first sub-path; false when empty.
    bool GetFirstPoint(double &x, double &y) const;
    /// The end point of the last segment; false when empty.
    bool GetLastPoint(double &x, double &y) const;
    /// No curves: every segment is straight.
    bool IsFlat() const;
    /// The box of every point, control points included (so it holds the curves).
    ShapeBox Bounds() const;
    const std::vector<SubPath> &SubPaths() const { return paths_; }

    // ---- new shapes ----
    /// Every point, control points too, through the affine part of `m`: an affine map takes a Bezier curve to
    /// the curve of its mapped control points, so the result is exact. A singular `m` gives a flattened shape
    /// (all points on a line or one point), not an error.
    Ref<Shape> TransformOfShape(const Matrix3 &m) const;
    /// Curves replaced by chords of at most ShapeTolerance, none further than a sixteenth of it from its
    /// curve (adaptive subdivision). A flat shape comes back as a copy.
    Ref<Shape> FlattenOfShapeTagList(const TagList &tags) const;
    /// The stroke: a band of total width |width| centred on the path, with
    /// ShapeJoin, ShapeCap, ShapeMiterLimit, ShapeTolerance; ShapeWriteStart
    /// and ShapeWriteEnd (fractions 0..1 of the whole length, clamped; end at
    /// or before start draws nothing) cut the path before it is stroked. The
    /// result is closed, non-overlapping contours (holes run the other way),
    /// the same under either fill rule.
    Ref<Shape> OutlineOfShapeTagList(double width, const TagList &tags) const;
    /// The filled region (non-zero rule) grown by `amount`, shrunk for a
    /// negative one, with ShapeJoin, ShapeMiterLimit, ShapeTolerance. A shrink
    /// past the shape leaves it empty. `solid` false gives only the border:
    /// the grown region less the original, or the original less the shrunk.
    Ref<Shape> ExpandOfShapeTagList(double amount, bool solid, const TagList &tags) const;

    size_t SizeOf() const override;

private:
    /// The sub-path new segments go to, started at (x, y) when none is open.
    SubPath &OpenSubPath(double x, double y);
    void AppendRationalBSpline(const ShapePoint *points, const double *weights, int n, bool closed,
                               const TagList &tags);

    std::vector<SubPath> paths_;
    bool open_ = false; ///< the last sub-path takes further segments
};

} // namespace Orvane
