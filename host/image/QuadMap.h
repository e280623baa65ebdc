#pragma once
// Maps between a rectangle and a four-cornered shape (a quad): the
// projective map (homography) that takes four points onto four others, and
// the bilinear map of the unit square onto a quad with its inverse.
//
// Corners are given in order around the shape. The bilinear map of the unit
// square onto corners p0, p1, p2, p3 (unit corners (0,0), (1,0), (1,1),
// (0,1) in that order) is
//     P(s, t) = (1-s)(1-t) p0 + s(1-t) p1 + s t p2 + (1-s) t p3,
// straight along lines of constant s and of constant t but bending other
// lines; the homography keeps every line straight.
//
// Thread safety: plain functions and values.
#include "host/core/Export.h"
#include "host/image/Matrix3.h"

namespace Orvane {

struct QuadPoint {
    double x = 0.0, y = 0.0;
};

/// The homography H with H * from[i] ~ to[i] (after the divide by w) for the
/// four pairs, normalised so that H(2, 2) = 1 where it is not near 0. False
/// when three points of either side lie on a line (within a relative 1e-9 of
/// the points' spread) or the system is singular.
ORVANE_API bool HomographyFromPoints(const QuadPoint from[4], const QuadPoint to[4], Matrix3 &out);

/// Whether the four corners, in order, make a convex quad turning one way
/// with no three on a line (relative 1e-9).
ORVANE_API bool IsConvexQuad(const QuadPoint corners[4]);

/// The bilinear map of the unit square onto a convex quad, and back.
class ORVANE_API BilinearQuad {
public:
    /// False (and an unusable map) unless the corners make a convex quad.
    bool Set(const QuadPoint corners[4]);
    /// The quad point of unit square position (s, t).
    void Forward(double s, double t, double &x, double &y) const;
    /// The unit square position (s, t) of quad point (x, y). Inside the quad
    /// the solution is unique; outside, the solution nearest to the square
    /// is chosen. False where none exists (the map folds there).
    bool Inverse(double x, double y, double &s, double &t) const;

private:
    QuadPoint a_, e_, f_, g_; ///< P(s, t) = a + e s + f t + g s t
};

} // namespace Orvane
