#pragma once
// PolyLine: an open or closed curve of points, the value that polygon masks
// draw with. It travels on links, is animated point by point and is saved in
// documents (docs/SHAPES_IN_DOCUMENTS.md).
//
// Three kinds share the point record:
//   PolyLine                cubic Bezier segments from each point's right
//                           handle to the next point's left handle, or a
//                           straight line where the point is marked straight
//   BSplinePolyLine         the points are control points of a uniform cubic
//                           B-spline, rational where the weights differ
//   CardinalSplinePolyLine  a curve through its points with tangents from the
//                           neighbours, converted exactly to a Bezier PolyLine
//
// Coordinates are fractions of the frame's width (X) and height (Y). Lengths
// and sample spacing are measured with Y divided by an `aspect` argument, so
// the caller chooses the units in which "evenly spaced" holds.
//
// Point i sits at the start of segment i. An open line of n points has n - 1
// segments, a closed one n (the last runs back to point 0). An open B-spline
// passes through its end points (each end is extended by a mirrored phantom
// control point); a closed one wraps around.
//
// Thread safety: a PolyLine is a Parameter, immutable once published; its
// const calls are safe from any number of threads.
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/flow/Parameter.h"

namespace Orvane {

struct PolyPoint {
    /// Match marks in `flags`: points carrying MatchMark on an inner and an
    /// outer line pair up in order, splitting both lines into facing spans.
    static constexpr uint32_t MatchMark = 0x200000;
    /// The second match bit, set on points that follow their partner's edits;
    /// cleared together with MatchMark when two lines' marks do not pair up.
    static constexpr uint32_t MatchFollow = 0x400000;
    static constexpr uint32_t MatchBits = MatchMark | MatchFollow;

    double x = 0.0, y = 0.0, z = 0.0;
    double leftX = 0.0, leftY = 0.0;   ///< handle toward the previous point, relative to the point
    double rightX = 0.0, rightY = 0.0; ///< handle toward the next point, relative to the point
    double weight = 1.0;               ///< B-spline weight, > 0
    bool straight = false;             ///< the segment to the next point is a straight line
    uint32_t flags = 0;

    bool operator==(const PolyPoint &) const = default;
};

/// A position on a curve.
struct PolySample {
    double x = 0.0, y = 0.0;
};

struct CurveSegment; // one measured piece of the curve (PolyLine.cpp)

class ORVANE_API PolyLine : public Parameter {
public:
    PolyLine() = default;
    explicit PolyLine(std::vector<PolyPoint> pts, bool isClosed = false) : points(std::move(pts)), closed(isClosed) {}

    std::vector<PolyPoint> points;
    bool closed = false;
    /// Frame aspect (height x pixel aspect Y / width x pixel aspect X) the
    /// line was drawn for; 1 when not known.
    double aspect = 1.0;

    /// Points whose flags have any bit of `mask`; all points for 0.
    int GetCount(uint32_t mask = 0) const;
    const PolyPoint *First() const { return points.empty() ? nullptr : &points.front(); }
    const PolyPoint *Last() const { return points.empty() ? nullptr : &points.back(); }
    double GetAspect() const { return aspect; }
    /// Position of point `index` as other tools see it (a tracker may drive it); nothing when out of range.
    std::optional<PolySample> GetPublishedPoint(int index) const;

    int SegmentCount() const;
    /// The curve at parameter t in [0, 1] of segment `segment`; nothing when out of range.
    std::optional<PolySample> PointAt(int segment, double t) const;

    /// Length of the curve with Y divided by `aspect` (non-positive or not finite: 1). Straight segments are
    /// exact, curved ones integrated to about 1e-12 relative.
    double CalcLength(double aspect) const;

    /// Spans: one more than the points carrying MatchMark. Span 0 runs from the start to the first marked point,
    /// the last from the last marked point to the end (back to point 0 on a closed line).
    int SpanCount() const;
    /// Samples spaced evenly by arc length (Y divided by `aspect` for measuring; the samples are in the line's own
    /// coordinates). A span of c samples holds its start and c - 1 more at equal steps of its length, up to but not
    /// including its end; the end of the line is one more sample. So a marked point is always sample number
    /// spans[0] + ... + spans[j-1], and two lines sampled with the same counts face each other sample for sample.
    ///   points null: writes per-span counts for about `count` samples into spans[0 .. SpanCount()), shared by
    ///     span length (a span of positive length gets at least 1); returns SpanCount(), or 0 when `size` is less.
    ///   points given: samples with the counts in spans[0 .. size), size == SpanCount() (spans null: the whole
    ///     line as one span of count - 1); writes sum + 1 samples when `count` has room, returns how many, or 0.
    int GetSamplePoints(int count, double aspect, PolySample *points, int *spans, int size) const;

    /// Same kind, point count, closed flag, marks and flags; numbers within `tolerance`.
    bool EqualToBy(const PolyLine &other, double tolerance) const;
    bool operator==(const PolyLine &other) const { return EqualToBy(other, 0.0); }
    /// Clears both match bits on every point (on a line not yet published).
    void ClearMatchMarks();

    /// Reads the document form of a line of `dataType` (one of the three polyline types); null with a reason in
    /// `problem` ("point 3, column 9: ...") when it does not fit.
    static Ref<PolyLine> FromScript(OvID dataType, const ScriptVal &v, std::string &problem);
    /// True for the three polyline data types.
    static bool IsPolyLineType(OvID dataType);
    /// An empty line of `dataType`; null for other types.
    static Ref<PolyLine> MakeOfType(OvID dataType);

    OvID DataType() const override;
    ScriptVal ToScript() const override;
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    bool BlendsWith(const Parameter &other) const override;
    Ref<Parameter> Interpolate(const Parameter &other, double t) const override;
    Ref<Parameter> WeightedSum(const Parameter *const *values, const double *weights, size_t count) const override;
    size_t SizeOf() const override { return sizeof(*this) + points.capacity() * sizeof(PolyPoint); }

protected:
    /// The curve as segments, Y divided by `yScale`.
    virtual void BuildSegments(double yScale, std::vector<CurveSegment> &out) const;
    /// A line of this kind holding `pts` and this line's other settings.
    virtual Ref<PolyLine> WithPoints(std::vector<PolyPoint> pts) const;
    void CopySettingsTo(PolyLine &to) const;
};

class ORVANE_API BSplinePolyLine : public PolyLine {
public:
    using PolyLine::PolyLine;
    OvID DataType() const override;
    /// True when all weights are equal (the plain, non-rational spline).
    bool IsUniform() const;

protected:
    void BuildSegments(double yScale, std::vector<CurveSegment> &out) const override;
    Ref<PolyLine> WithPoints(std::vector<PolyPoint> pts) const override;
};

class ORVANE_API CardinalSplinePolyLine : public PolyLine {
public:
    using PolyLine::PolyLine;
    /// Tangent scale: the handles of point i are +-(P[i+1] - P[i-1]) * tension / 3; 0.5 is the Catmull-Rom curve.
    /// An open line's ends use the end point itself for the missing neighbour.
    double tension = 0.5;

    OvID DataType() const override;
    /// The same curve as a plain Bezier PolyLine (handles set, marks and flags kept).
    Ref<PolyLine> ToBezier() const;

protected:
    void BuildSegments(double yScale, std::vector<CurveSegment> &out) const override;
    Ref<PolyLine> WithPoints(std::vector<PolyPoint> pts) const override;
};

} // namespace Orvane
