// Shape: building, reading, flattening and the uniform B-splines. Stroking and
// offsetting are in ShapeOffset.cpp.
#include "host/shape/Shape.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"

namespace Orvane {

namespace {

/// A point of a rational curve in homogeneous form: (x w, y w, w).
struct HomPoint {
    double x, y, w;
    HomPoint operator+(const HomPoint &o) const { return {x + o.x, y + o.y, w + o.w}; }
    HomPoint operator*(double s) const { return {x * s, y * s, w * s}; }
    ShapePoint Projected() const { return {x / w, y / w}; }
};

/// Halving a curve 16 times gives 65536 chords: the most one curve can get.
constexpr int kMaxSubdivision = 16;

double DistanceToSegment(const ShapePoint &p, const ShapePoint &a, const ShapePoint &b) {
    const double dx = b.x - a.x, dy = b.y - a.y, len2 = dx * dx + dy * dy;
    double t = len2 > 0.0 ? ((p.x - a.x) * dx + (p.y - a.y) * dy) / len2 : 0.0;
    t = std::clamp(t, 0.0, 1.0);
    const double ex = p.x - (a.x + t * dx), ey = p.y - (a.y + t * dy);
    return std::sqrt(ex * ex + ey * ey); // lengths here are far from overflow; hypot costs several times more
}

/// Appends the chords of a rational cubic (c[0] excluded, c[3] included),
/// each at most `step` long and within step / 16 of its curve. With positive
/// weights the curve lies in the hull of its projected control points, so
/// when both inner ones are within step / 16 of the chord, so is the whole
/// piece of curve, and (as it runs from one end of the chord to the other)
/// every point of the chord is within step / 16 of the curve; the control
/// polygon's length bounds the chord's.
void FlattenRationalCubic(const HomPoint c[4], double step, int depth, std::vector<Shape::Vertex> &out) {
    const ShapePoint p0 = c[0].Projected(), p1 = c[1].Projected(), p2 = c[2].Projected(), p3 = c[3].Projected();
    const double err = std::max(DistanceToSegment(p1, p0, p3), DistanceToSegment(p2, p0, p3));
    auto dist = [](const ShapePoint &a, const ShapePoint &b) {
        return std::sqrt((b.x - a.x) * (b.x - a.x) + (b.y - a.y) * (b.y - a.y));
    };
    const double length = dist(p0, p1) + dist(p1, p2) + dist(p2, p3);
    if ((err <= step / 16 && length <= step) || depth >= kMaxSubdivision || !std::isfinite(err + length)) {
        out.push_back({p3.x, p3.y, false});
        return;
    }
    // de Casteljau at t = 1/2, in homogeneous form.
    const HomPoint m01 = (c[0] + c[1]) * 0.5, m12 = (c[1] + c[2]) * 0.5, m23 = (c[2] + c[3]) * 0.5;
    const HomPoint m012 = (m01 + m12) * 0.5, m123 = (m12 + m23) * 0.5, mid = (m012 + m123) * 0.5;
    const HomPoint left[4] = {c[0], m01, m012, mid}, right[4] = {mid, m123, m23, c[3]};
    FlattenRationalCubic(left, step, depth + 1, out);
    FlattenRationalCubic(right, step, depth + 1, out);
}

double ToleranceOf(const TagList &tags) {
    const double tol = tags.GetDouble(ShapeTolerance, ShapeDefaultTolerance);
    return tol > 0.0 && std::isfinite(tol) ? tol : ShapeDefaultTolerance;
}

} // namespace

Shape::SubPath &Shape::OpenSubPath(double x, double y) {
    if (!open_) {
        // After Close, a segment starts from the closed sub-path's first point.
        if (!paths_.empty() && paths_.back().closed) {
            x = paths_.back().points.front().x;
            y = paths_.back().points.front().y;
        }
        MoveTo(x, y);
    }
    return paths_.back();
}

void Shape::MoveTo(double x, double y) {
    paths_.push_back(SubPath{{{x, y, false}}, false});
    open_ = true;
}

void Shape::LineTo(double x, double y) { OpenSubPath(x, y).points.push_back({x, y, false}); }

void Shape::BezierTo(double c1x, double c1y, double c2x, double c2y, double x, double y) {
    SubPath &sp = OpenSubPath(x, y);
    sp.points.push_back({c1x, c1y, true});
    sp.points.push_back({c2x, c2y, true});
    sp.points.push_back({x, y, false});
}

void Shape::Close() {
    if (!open_) return;
    paths_.back().closed = true;
    open_ = false;
}

void Shape::AddShape(const Shape &other) {
    if (&other == this) {
        const std::vector<SubPath> copy = other.paths_;
        paths_.insert(paths_.end(), copy.begin(), copy.end());
    } else {
        paths_.insert(paths_.end(), other.paths_.begin(), other.paths_.end());
    }
    open_ = false;
}

int Shape::GetCount() const {
    size_t n = 0;
    for (const SubPath &sp : paths_) n += sp.points.size();
    return static_cast<int>(n);
}

bool Shape::GetFirstPoint(double &x, double &y) const {
    if (paths_.empty()) return false;
    x = paths_.front().points.front().x;
    y = paths_.front().points.front().y;
    return true;
}

bool Shape::GetLastPoint(double &x, double &y) const {
    if (paths_.empty()) return false;
    x = paths_.back().points.back().x;
    y = paths_.back().points.back().y;
    return true;
}

bool Shape::IsFlat() const {
    for (const SubPath &sp : paths_)
        for (const Vertex &v : sp.points)
            if (v.control) return false;
    return true;
}

ShapeBox Shape::Bounds() const {
    ShapeBox box;
    bool any = false;
    for (const SubPath &sp : paths_)
        for (const Vertex &v : sp.points) {
            if (!any) {
                box = {v.x, v.y, v.x, v.y};
                any = true;
            }
            box.x0 = std::min(box.x0, v.x);
            box.y0 = std::min(box.y0, v.y);
            box.x1 = std::max(box.x1, v.x);
            box.y1 = std::max(box.y1, v.y);
        }
    return box;
}

size_t Shape::SizeOf() const {
    return sizeof(*this) + paths_.capacity() * sizeof(SubPath) + static_cast<size_t>(GetCount()) * sizeof(Vertex);
}

Ref<Shape> Shape::TransformOfShape(const Matrix3 &m) const {
    Ref<Shape> out = MakeRef<Shape>();
    out->paths_ = paths_;
    for (SubPath &sp : out->paths_)
        for (Vertex &v : sp.points) {
            const double x = v.x, y = v.y;
            v.x = m(0, 0) * x + m(0, 1) * y + m(0, 2);
            v.y = m(1, 0) * x + m(1, 1) * y + m(1, 2);
        }
    return out;
}

Ref<Shape> Shape::FlattenOfShapeTagList(const TagList &tags) const {
    const double tol = ToleranceOf(tags);
    Ref<Shape> flat = MakeRef<Shape>();
    flat->paths_.reserve(paths_.size());
    for (const SubPath &sp : paths_) {
        SubPath out{{}, sp.closed};
        out.points.reserve(sp.points.size());
        for (size_t i = 0; i < sp.points.size(); ++i) {
            const Vertex &v = sp.points[i];
            if (!v.control || i == 0 || i + 2 >= sp.points.size()) {
                if (!v.control) out.points.push_back(v);
                continue;
            }
            const Vertex &from = sp.points[i - 1], &c2 = sp.points[i + 1], &to = sp.points[i + 2];
            const HomPoint c[4] = {{from.x, from.y, 1.0}, {v.x, v.y, 1.0}, {c2.x, c2.y, 1.0}, {to.x, to.y, 1.0}};
            FlattenRationalCubic(c, tol, 0, out.points);
            i += 2;
        }
        flat->paths_.push_back(std::move(out));
    }
    return flat;
}

void Shape::FlatBSplineTo(const ShapePoint *points, int n, bool closed, const TagList &tags) {
    AppendRationalBSpline(points, nullptr, n, closed, tags);
}

void Shape::FlatTBSplineTo(const ShapePoint *points, const double *weights, int n, bool closed, const TagList &tags) {
    AppendRationalBSpline(points, weights, n, closed, tags);
}

void Shape::AppendRationalBSpline(const ShapePoint *points, const double *weights, int n, bool closed,
                                  const TagList &tags) {
    if (!points || n <= 0) return;
    // Control points in homogeneous form. An open curve gets one more control
    // point beyond each end, the next one mirrored through the end point (in
    // homogeneous form), so that it starts and ends on its end points with
    // n - 1 pieces: the curve PolyLine measures and samples.
    std::vector<HomPoint> ctl;
    ctl.reserve(static_cast<size_t>(n + 3));
    auto hom = [&](int i) {
        const double w = weights ? std::max(weights[i], 1e-9) : 1.0;
        return HomPoint{points[i].x * w, points[i].y * w, w};
    };
    if (!closed && n > 1) ctl.push_back(hom(0) * 2.0 + hom(1) * -1.0);
    for (int i = 0; i < n; ++i) ctl.push_back(hom(i));
    if (!closed && n > 1) ctl.push_back(hom(n - 1) * 2.0 + hom(n - 2) * -1.0);
    if (closed) {
        // Segment i uses points i-1 .. i+2: rotate so the list runs n-1, 0, .., n-1, 0, 1.
        ctl.insert(ctl.begin(), hom(n - 1));
        ctl.push_back(hom(0));
        ctl.push_back(hom(1 % n));
    }
    const size_t segments = ctl.size() - 3;
    const double tol = ToleranceOf(tags);
    auto bezierStart = [&](size_t s) { return (ctl[s] + ctl[s + 1] * 4.0 + ctl[s + 2]) * (1.0 / 6.0); };
    const ShapePoint start = n == 1 ? points[0] : bezierStart(0).Projected();
    SubPath &sp = OpenSubPath(start.x, start.y);
    const Vertex &last = sp.points.back();
    if (last.x != start.x || last.y != start.y) sp.points.push_back({start.x, start.y, false});
    if (n == 1) return;
    for (size_t s = 0; s < segments; ++s) {
        const HomPoint &q1 = ctl[s + 1], &q2 = ctl[s + 2];
        const HomPoint c[4] = {bezierStart(s), (q1 * 2.0 + q2) * (1.0 / 3.0), (q1 + q2 * 2.0) * (1.0 / 3.0),
                               (q1 + q2 * 4.0 + ctl[s + 3]) * (1.0 / 6.0)};
        FlattenRationalCubic(c, tol, 0, sp.points);
    }
}

} // namespace Orvane
