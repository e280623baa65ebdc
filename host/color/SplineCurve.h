#pragma once
// SplineCurve: an editable curve y = f(x) through control points, the value of
// a curve input (data type LookUpTable) such as the channel curves of Color
// Curves and the hue curves of Hue Curves.
//
// Shape: a monotone cubic Hermite spline. The curve passes through every
// point; between two points it is a cubic Hermite segment whose end slopes
// start as the mean of the neighbouring chord slopes (0 where the chords turn,
// the chord slope at the curve's ends) and are then scaled down where they
// would overshoot. So the curve is smooth (continuous slope), never leaves the
// range of two neighbouring points, and rises (or falls) wherever its points
// do; points on a straight line give that line exactly. A single point gives
// a flat curve.
//
// Two ways to read a curve:
//  - open: beyond its first and last points it goes on as a straight line with
//    the slope it has there;
//  - periodic (hue curves): x is taken modulo 1 and the points, all with
//    0 <= x < 1, wrap around, the last joining the first one turn later.
//
// Document form (points in any order):
//   LookUpTable { Points = { { 0, 0 }, { 0.5, 0.6 }, { 1, 1 } } }
//
// Thread safety: a SplineCurve is immutable once published, and a Spline is
// immutable after construction; both are safe to read from any thread.
#include <algorithm>
#include <cmath>
#include <string>
#include <vector>

#include "host/flow/Parameter.h"

namespace Orvane {

struct CurvePoint {
    double x = 0.0, y = 0.0;
    bool operator==(const CurvePoint &) const = default;
};

/// Points in their document form { { x, y }, ... }, and back: false unless
/// the list holds nothing but pairs of finite numbers.
ORVANE_API ScriptVal PointsToScript(const std::vector<CurvePoint> &points);
ORVANE_API bool PointsFromScript(const ScriptVal &list, std::vector<CurvePoint> &points);

/// The curve of a valid set of points (SplineCurve::Problem is empty), ready
/// to evaluate.
class ORVANE_API Spline {
public:
    Spline(const std::vector<CurvePoint> &sortedPoints, bool periodic);

    double operator()(double x) const { return Eval(x, false); }
    /// The slope dy/dx at x.
    double Slope(double x) const { return Eval(x, true); }

private:
    double Eval(double x, bool slope) const;
    std::vector<double> x_, y_, m_; ///< knots and their slopes; periodic: the first repeated one turn on
    bool periodic_;
};

/// A curve sampled at x = i / kSteps (i = 0..kSteps, so at every 16-bit code)
/// and read between samples along straight lines. An open table goes on
/// beyond 0..1 as a straight line with the slopes given for its ends; a
/// periodic one takes x modulo 1. NaN (and, periodic, an infinite x) reads
/// as NaN.
class CurveTable {
public:
    static constexpr int kSteps = 65535;

    explicit CurveTable(bool periodic = false) : values_(kSteps + 1), periodic_(periodic) {}

    /// Sample i (at x = i / kSteps).
    double &operator[](int i) { return values_[static_cast<size_t>(i)]; }
    void SetEndSlopes(double atZero, double atOne) { slope0_ = atZero, slope1_ = atOne; }

    double operator()(double x) const {
        if (periodic_) x -= std::floor(x); // an infinite x becomes NaN here
        if (x != x) return x;
        if (x < 0.0)
            return values_.front() + x * slope0_;
        else if (x > 1.0)
            return values_.back() + (x - 1.0) * slope1_;
        const double at = x * kSteps;
        const int i = std::min(static_cast<int>(at), kSteps - 1);
        const double a = values_[static_cast<size_t>(i)], b = values_[static_cast<size_t>(i) + 1];
        return a + (at - i) * (b - a);
    }

private:
    std::vector<double> values_;
    double slope0_ = 0.0, slope1_ = 0.0;
    bool periodic_;
};

class ORVANE_API SplineCurve : public Parameter {
public:
    /// The identity: points (0, 0) and (1, 1).
    SplineCurve() : SplineCurve({{0.0, 0.0}, {1.0, 1.0}}) {}
    /// Points in any order; they are sorted by x (equal x keep their order).
    explicit SplineCurve(std::vector<CurvePoint> points);
    /// A flat curve at y (one point, at 0; open or periodic).
    static Ref<SplineCurve> Flat(double y) { return MakeRef<SplineCurve>(std::vector<CurvePoint>{{0, y}}); }

    const std::vector<CurvePoint> &Points() const { return points_; }

    /// Empty when the curve can be read (open, or periodic); otherwise what is
    /// wrong with it, as a phrase: no points, two points at one x, or (periodic)
    /// a point outside 0 <= x < 1.
    std::string Problem(bool periodic) const;
    /// The curve to evaluate; only for a curve without a Problem.
    Spline ToSpline(bool periodic) const { return Spline(points_, periodic); }

    /// Two or more points, every one on y = x (the curve is the identity when open).
    bool IsIdentity() const;
    /// Every point has y == value (the curve is flat at value).
    bool IsFlatAt(double value) const;

    OvID DataType() const override;
    ScriptVal ToScript() const override;
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override { return MakeRef<SplineCurve>(points_); }
    size_t SizeOf() const override { return sizeof(*this) + points_.capacity() * sizeof(CurvePoint); }

    /// Reads the document form (typed LookUpTable or a plain table); null
    /// when it is not a list of points of two finite numbers each.
    static Ref<SplineCurve> FromScript(const ScriptVal &value);

private:
    std::vector<CurvePoint> points_; ///< sorted by x
};

} // namespace Orvane
