#pragma once
// The motion of a shot from trackers: the similarity (translation, rotation,
// scale) that takes the trackers' positions at a reference time to their
// positions at another time, fitted by least squares (Procrustes) about the
// trackers' mean, in square units (y scaled by the frame's height over
// width, so that angles are angles on screen).
//
// The pivot is the point the rotation and scale turn about and whose
// movement is the translation: the trackers' mean ("Tracker average"), one
// tracker ("Selected tracker": it moves exactly as that tracker did), or a
// fixed point ("Manual": it moves as the fitted motion takes it). Position,
// Rotation and Scaling off keep the pivot still, the angle 0 and the scale
// 1.
//
// As a Transform step (Pivot, Center, Angle, Size): the motion itself,
// "unsteady", is Pivot = pivot at the reference, Center = 0.5 + movement;
// its inverse, "steady", is Pivot = pivot now, Center = 0.5 - movement,
// -Angle and 1 / Size.
//
// The reference of "Start & end" runs from the path's first key to its last
// through evenly spaced positions of the path (ReferenceIntermediatePoints),
// so steadying keeps the shot's slow move and takes out the rest. A tracker
// whose path starts or ends inside the shot is weighted in the fit, fading in
// and out over IncompleteTrackerFadeInOutFrames, and where no tracker counts
// fully the motion itself fades (FadeMotion).
//
// Thread safety: plain functions and values.
#include <algorithm>
#include <cmath>
#include <numbers>
#include <vector>

namespace Orvane::tracking {

/// One tracker's position at the reference time (rx, ry) and now (x, y), frame fractions, and how much it counts.
struct TrackPair {
    double rx, ry, x, y;
    double weight = 1.0;
};

/// How each tracker's reference position is taken (Reference, ReferenceIntermediatePoints).
struct ReferenceMode {
    int mode = 1;            ///< 0 "Select time", 1 "Start", 2 "Start & end", 3 "End"
    double selectTime = 0.0; ///< the time of "Select time"
    int intermediate = 0;    ///< "Start & end": path positions between the ends the reference passes through
};

/// The "Start & end" reference at `time`: a smooth curve through the path's positions at `knots` (>= 2) evenly
/// spaced times from `first` to `last` (cubic Hermite segments, tangents from the neighbouring knots, one-sided
/// at the ends), held beyond them. With two knots it is the straight line from the first position to the last.
/// `at(t, x, y)` gives the path's position at time t.
template <class At>
void SmoothReference(double first, double last, int knots, double time, At &&at, double &x, double &y) {
    knots = std::max(knots, 2);
    if (!(last > first)) return at(first, x, y);
    const double span = (last - first) / (knots - 1);
    const double u = std::clamp((time - first) / span, 0.0, knots - 1.0);
    const int k = std::min(static_cast<int>(u), knots - 2);
    const double f = u - k;
    auto knot = [&](int i, double &kx, double &ky) { at(first + std::clamp(i, 0, knots - 1) * span, kx, ky); };
    // Tangents per knot step: central differences inside, one-sided at the ends.
    auto tangent = [&](int i, double &tx, double &ty) {
        double ax, ay, bx, by;
        knot(i - 1 < 0 ? i : i - 1, ax, ay);
        knot(i + 1 > knots - 1 ? i : i + 1, bx, by);
        const double steps = (i > 0 && i < knots - 1) ? 2.0 : 1.0;
        tx = (bx - ax) / steps, ty = (by - ay) / steps;
    };
    double p0x, p0y, p1x, p1y, m0x, m0y, m1x, m1y;
    knot(k, p0x, p0y);
    knot(k + 1, p1x, p1y);
    tangent(k, m0x, m0y);
    tangent(k + 1, m1x, m1y);
    const double f2 = f * f, f3 = f2 * f;
    const double h00 = 2 * f3 - 3 * f2 + 1, h10 = f3 - 2 * f2 + f, h01 = -2 * f3 + 3 * f2, h11 = f3 - f2;
    x = h00 * p0x + h10 * m0x + h01 * p1x + h11 * m1x;
    y = h00 * p0y + h10 * m0y + h01 * p1y + h11 * m1y;
}

enum class Pivot { Average, Selected, Manual };

struct MotionOptions {
    bool position = true, rotation = true, scaling = true;
    Pivot pivot = Pivot::Average;
    size_t selected = 0;                 ///< the tracker of Pivot::Selected, an index of the pairs
    double manualX = 0.5, manualY = 0.5; ///< Pivot::Manual
    double aspect = 1.0;                 ///< frame height over width, in square units
};

struct Motion {
    double pivotRefX = 0.5, pivotRefY = 0.5; ///< the pivot at the reference time
    double moveX = 0.0, moveY = 0.0;         ///< how far the pivot moved (frame fractions)
    double angle = 0.0;                      ///< degrees, anticlockwise
    double scale = 1.0;
};

/// The motion of `pairs`, each counting by its weight (none, or no weight: no motion).
inline Motion FitMotion(const std::vector<TrackPair> &pairs, const MotionOptions &o) {
    Motion m;
    double n = 0;
    for (const TrackPair &p : pairs) n += p.weight;
    if (!(n > 0)) return m;
    const double a = o.aspect > 0 ? o.aspect : 1.0;
    double mrx = 0, mry = 0, mx = 0, my = 0;
    for (const TrackPair &p : pairs)
        mrx += p.weight * p.rx, mry += p.weight * p.ry, mx += p.weight * p.x, my += p.weight * p.y;
    mrx /= n, mry /= n, mx /= n, my /= n;
    // Least squares rotation and scale of the centred positions in square units.
    double dot = 0, cross = 0, norm = 0;
    for (const TrackPair &p : pairs) {
        const double ux = p.rx - mrx, uy = (p.ry - mry) * a, vx = p.x - mx, vy = (p.y - my) * a;
        dot += p.weight * (ux * vx + uy * vy);
        cross += p.weight * (ux * vy - uy * vx);
        norm += p.weight * (ux * ux + uy * uy);
    }
    double theta = 0.0, s = 1.0;
    if (pairs.size() >= 2 && norm > 0 && (dot != 0 || cross != 0)) {
        theta = std::atan2(cross, dot);
        s = std::hypot(dot, cross) / norm;
    }
    if (o.rotation) m.angle = theta * 180.0 / std::numbers::pi;
    if (o.scaling) m.scale = s;
    // Where the pivot is at the reference, and where the fitted motion (or the selected tracker) takes it.
    double px = mrx, py = mry, qx = mx, qy = my;
    if (o.pivot == Pivot::Selected && o.selected < pairs.size()) {
        px = pairs[o.selected].rx, py = pairs[o.selected].ry, qx = pairs[o.selected].x, qy = pairs[o.selected].y;
    } else if (o.pivot == Pivot::Manual) {
        px = o.manualX, py = o.manualY;
        const double ux = px - mrx, uy = (py - mry) * a;
        qx = mx + s * (std::cos(theta) * ux - std::sin(theta) * uy);
        qy = my + s * (std::sin(theta) * ux + std::cos(theta) * uy) / a;
    }
    m.pivotRefX = px, m.pivotRefY = py;
    if (o.position) m.moveX = qx - px, m.moveY = qy - py;
    return m;
}

/// The motion taken only `amount` (0..1) of the way from none: movement and angle scaled, scale by its power.
inline Motion FadeMotion(Motion m, double amount) {
    amount = std::clamp(amount, 0.0, 1.0);
    m.moveX *= amount, m.moveY *= amount, m.angle *= amount;
    m.scale = m.scale > 0 ? std::pow(m.scale, amount) : m.scale;
    return m;
}

} // namespace Orvane::tracking
