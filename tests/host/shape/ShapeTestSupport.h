#pragma once
// Polygons and measures shared by the shape tests, computed independently of the code under test.
#include <cmath>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/shape/Shape.h"
#include "host/shape/ShapeTree.h"

namespace Orvane::shapetest {

/// Signed area (counter-clockwise positive) summed over the sub-paths of a flat shape: the area of a shape whose
/// holes run the other way.
inline double SignedArea(const Shape &s) {
    double a = 0;
    for (const Shape::SubPath &sp : s.SubPaths())
        for (size_t i = 0, n = sp.points.size(); i < n; ++i) {
            const Shape::Vertex &p = sp.points[i], &q = sp.points[(i + 1) % n];
            a += p.x * q.y - q.x * p.y;
        }
    return a / 2;
}

/// A closed polygon through `pts`, each rotated by `deg` about (cx, cy).
inline Ref<Shape> Polygon(const std::vector<ShapePoint> &pts, double deg = 0, double cx = 0, double cy = 0) {
    Ref<Shape> s = MakeRef<Shape>();
    const double c = std::cos(deg * M_PI / 180), sn = std::sin(deg * M_PI / 180);
    for (size_t i = 0; i < pts.size(); ++i) {
        const double x = cx + (pts[i].x - cx) * c - (pts[i].y - cy) * sn;
        const double y = cy + (pts[i].x - cx) * sn + (pts[i].y - cy) * c;
        i == 0 ? s->MoveTo(x, y) : s->LineTo(x, y);
    }
    s->Close();
    return s;
}

/// n points of an ellipse of half-axes (a, b) about (cx, cy), counter-clockwise.
inline std::vector<ShapePoint> EllipsePoints(double cx, double cy, double a, double b, int n) {
    std::vector<ShapePoint> pts;
    for (int i = 0; i < n; ++i)
        pts.push_back({cx + a * std::cos(2 * M_PI * i / n), cy + b * std::sin(2 * M_PI * i / n)});
    return pts;
}

/// A w x h rectangle with corner radius r (arcs of n points each) with its lower left corner at (x, y).
inline std::vector<ShapePoint> RoundedRectPoints(double x, double y, double w, double h, double r, int n) {
    std::vector<ShapePoint> pts;
    const ShapePoint centres[4] = {{x + w - r, y + r}, {x + w - r, y + h - r}, {x + r, y + h - r}, {x + r, y + r}};
    for (int c = 0; c < 4; ++c)
        for (int i = 0; i <= n; ++i) {
            const double a = (c - 1) * M_PI / 2 + M_PI / 2 * i / n;
            pts.push_back({centres[c].x + r * std::cos(a), centres[c].y + r * std::sin(a)});
        }
    return pts;
}

/// Distance from p to the nearest segment of the polyline through all points of a flat shape's sub-paths.
inline double DistanceToPolyline(const ShapePoint &p, const Shape &s) {
    double best = INFINITY;
    for (const Shape::SubPath &sp : s.SubPaths()) {
        const size_t n = sp.points.size();
        for (size_t i = 0; i < n; ++i) {
            const Shape::Vertex &a = sp.points[i], &b = sp.points[std::min(i + 1, n - 1)];
            const double dx = b.x - a.x, dy = b.y - a.y, l2 = dx * dx + dy * dy;
            const double t = l2 > 0 ? std::clamp(((p.x - a.x) * dx + (p.y - a.y) * dy) / l2, 0.0, 1.0) : 0.0;
            best = std::min(best, std::hypot(p.x - a.x - t * dx, p.y - a.y - t * dy));
        }
    }
    return best;
}

/// The corners of an axis-aligned box, anticlockwise.
inline std::vector<ShapePoint> Box(double x0, double y0, double x1, double y1) {
    return {{x0, y0}, {x1, y0}, {x1, y1}, {x0, y1}};
}

/// A filled style of straight colour (r, g, b, a) at `opacity`.
inline ShapeStyle FillStyle(float r, float g, float b, float a, double opacity = 1.0) {
    ShapeStyle s;
    s.fillColor[0] = r, s.fillColor[1] = g, s.fillColor[2] = b, s.fillColor[3] = a, s.opacity = opacity;
    return s;
}

/// Appends a node of `shape` and `style` to `parent`; gives the node.
inline ShapeNode &AddNode(ShapeNode &parent, Ref<Shape> shape, const ShapeStyle &style) {
    Ref<ShapeNode> n = MakeRef<ShapeNode>();
    n->SetShape(std::move(shape));
    n->SetStyle(style);
    parent.AppendChild(n);
    return *n;
}

} // namespace Orvane::shapetest
