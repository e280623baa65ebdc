#pragma once
// What the shape generators share: the placement controls and the exact
// geometry they build from.
//
// Placement. Center is a point in frame fractions, as every point control
// (X 0..1 across the width, Y 0..1 up the height), so the crosshair sits
// where the user put it whatever the frame's aspect; in shape units it is
// (X, Y x aspect), the aspect read from the request's reference frame (1
// when none is known). Width, Height and Size are lengths in shape units
// (fractions of the frame width on both axes), so a circle stays round.
// Angle turns the shape anticlockwise, in degrees, about Center.
//
// A generator builds its shape about the origin (the local shape) and
// Place moves it: rotation, then translation to Center. Both are affine, so
// the curves stay exact. The node made gets its axis at Center, the
// tool's style and copy number 0 (seed 0): a generator makes the original
// of a sequence, so the Step parts of its numbers add nothing and the
// Random parts one fixed draw.
//
// Thread safety: as ShapeOperator.
#include <cmath>
#include <vector>

#include "host/shape/ShapeOperator.h"

namespace Orvane {

/// Appends an elliptical arc about (cx, cy) with radii (rx, ry) from `startDeg` over `sweepDeg` (anticlockwise
/// when positive) as cubic Beziers of at most 45 degrees each, to the open sub-path, whose current point the
/// caller has put at the arc's start. A piece of angle t has its handles at 4/3 tan(t/4) of the radius; for 45 degrees
/// the curve leaves the circle by at most 4.2e-6 of the radius, outward only.
void AppendArc(Shape &shape, double cx, double cy, double rx, double ry, double startDeg, double sweepDeg);
/// The ellipse of radii (rx, ry) about the origin: eight 45-degree arcs, closed, starting at (rx, 0).
Ref<Shape> EllipseShape(double rx, double ry);
/// The w x h rectangle centred on the origin, anticlockwise from its bottom left corner, its corners rounded by
/// quarter circles of `radius` (clamped to 0 .. half the shorter side); sharp corners for radius 0.
Ref<Shape> RoundedRectangleShape(double w, double h, double radius);
/// A closed polygon through alternating radii about the origin: vertex k at angle 90 + 360 k / count degrees
/// (the first straight up, anticlockwise) and radius (rx, ry) x scales[k % scales.size()].
Ref<Shape> RadialPolygonShape(int count, double rx, double ry, const std::vector<double> &scales);

class ShapeGenerator : public ShapeOperator {
public:
    ShapeGenerator(const Registry *reg, const ScriptVal &args, const TagList &tags);

    /// The frame's aspect (height x pixel aspect Y over width x pixel aspect X) of the request's reference
    /// frame; 1 when the request has none.
    static double FrameAspect(Request *req);

protected:
    /// Where a shape goes: Center in shape units and the turn.
    struct Placement {
        double cx = 0.5, cy = 0.5, angle = 0.0;
    };

    /// "Center" (a point, frame fractions).
    void AddCenterInput();
    /// "Width" and "Height" (shape units, default `def`), per-shape numbers.
    void AddWidthHeightInputs(double def);
    /// "Size" (a scale of the drawn line, default 1), a per-shape number.
    void AddSizeInput();
    /// "Angle" (degrees), a per-shape number.
    void AddAngleInput();

    Placement PlacementOf(Request *req, const VarianceState &state) const;
    double WidthOf(const VarianceState &s) const { return width_->GetValue(s); }
    double HeightOf(const VarianceState &s) const { return height_->GetValue(s); }
    double SizeOf(const VarianceState &s) const { return size_->GetValue(s); }

    /// A node of `local` (built about the origin) turned and moved by `at`, its axis at `at`'s centre, styled.
    Ref<ShapeNode> PlacedNode(const Shape &local, const Placement &at, const VarianceState &state) const;
    /// Hands on a tree of one node: `local` placed by the controls.
    void OutputShape(Request *req, const Shape &local) const;

private:
    Input *center_ = nullptr;
    VarianceInput *width_ = nullptr, *height_ = nullptr, *size_ = nullptr, *angle_ = nullptr;
};

/// A number slider from `low` to `high`, default `def`, held at or above `min` where that is finite.
TagList SliderTags(double def, double low, double high, double min = -HUGE_VAL);
/// A whole number (data type Number) on a slider from `low` to `high`, default `def`, held to min..max.
TagList CountTags(double def, double low, double high, double min, double max);
/// The whole number on `in`, rounded and held to min..max.
int CountOf(Request *req, const Input *in, int def, int min, int max);

/// `shape` when its points are all finite, else null: a value that is not a number (an expression's) draws nothing
/// rather than reach the clipper.
Ref<const Shape> FiniteOrNull(Ref<const Shape> shape);

/// The registry row of shape tool `id` (path "Tools/Shape/<id>", its icon, category "Shape", no blend, material
/// or motion blur controls, regions of interest); `generator` adds the source kind and the generator flags.
TagList ShapeToolRow(const char *id, const char *classWord, const char *abbreviation, const char *help, bool generator);

} // namespace Orvane
