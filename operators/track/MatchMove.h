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
// Thread safety: plain functions and values.
#include <cmath>
#include <numbers>
#include <vector>

namespace Orvane::tracking {

/// One tracker's position at the reference time (rx, ry) and now (x, y), frame fractions.
struct TrackPair {
    double rx, ry, x, y;
};

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

/// The motion of `pairs` (none: no motion).
inline Motion FitMotion(const std::vector<TrackPair> &pairs, const MotionOptions &o) {
    Motion m;
    if (pairs.empty()) return m;
    const double a = o.aspect > 0 ? o.aspect : 1.0;
    double mrx = 0, mry = 0, mx = 0, my = 0;
    for (const TrackPair &p : pairs) mrx += p.rx, mry += p.ry, mx += p.x, my += p.y;
    const double n = static_cast<double>(pairs.size());
    mrx /= n, mry /= n, mx /= n, my /= n;
    // Least squares rotation and scale of the centred positions in square units.
    double dot = 0, cross = 0, norm = 0;
    for (const TrackPair &p : pairs) {
        const double ux = p.rx - mrx, uy = (p.ry - mry) * a, vx = p.x - mx, vy = (p.y - my) * a;
        dot += ux * vx + uy * vy;
        cross += ux * vy - uy * vx;
        norm += ux * ux + uy * uy;
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

} // namespace Orvane::tracking
