#pragma once
// Shape units to and from the integer polygons of the Clipper library
// (libpolyclipping): one shape unit is 2^24 Clipper units, so a pixel of a
// 16384-pixel-wide frame is 1024 units and coordinates up to about 2.4e11
// frame widths stay within Clipper's range. docs/SHAPES.md has the reasons.
//
// Internal to host/shape (it includes clipper.hpp): the stroker and the
// boolean adaptor (ShapeClip.h) share it.
//
// Thread safety: plain functions.
#include <algorithm>
#include <cmath>

#include <clipper.hpp>

#include "host/shape/Shape.h"

namespace Orvane::clipperunits {

namespace CL = ClipperLib;

/// Shape units to Clipper's integers: 2^24.
constexpr double kScale = 16777216.0;
/// Clipper refuses coordinates beyond this.
constexpr double kRange = 4.0e18;

/// A value already in Clipper units, rounded onto the grid and kept in range.
inline CL::cInt Round(double v) { return static_cast<CL::cInt>(std::llround(std::clamp(v, -kRange, kRange))); }

/// A point in shape units on Clipper's grid.
inline CL::IntPoint ToInt(double x, double y) { return {Round(x * kScale), Round(y * kScale)}; }

/// Closed contours back in shape units; contours of fewer than 3 points are dropped.
inline Ref<Shape> ShapeOfPaths(const CL::Paths &paths) {
    Ref<Shape> shape = MakeRef<Shape>();
    for (const CL::Path &path : paths) {
        if (path.size() < 3) continue;
        shape->MoveTo(path[0].X / kScale, path[0].Y / kScale);
        for (size_t i = 1; i < path.size(); ++i) shape->LineTo(path[i].X / kScale, path[i].Y / kScale);
        shape->Close();
    }
    return shape;
}

} // namespace Orvane::clipperunits
