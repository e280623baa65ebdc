// Shape::OutlineOfShapeTagList and Shape::ExpandOfShapeTagList: stroking and
// offsetting over Clipper's integer polygons.
//
// Clipper's own offsetter knows round, miter (squared off at half the width
// beyond the limit) and square joins, but neither a true bevel nor a miter
// clipped at the limit. So the raw offset loops are built here, the way that
// offsetter builds them (each side of a path with its joins, caps at open
// ends, the corner point itself on the inner side of a turn), with all four
// joins, and Clipper's union under the positive fill rule turns the loops,
// whatever they overlap, into clean contours. docs/SHAPES.md has the scale.
#include <algorithm>
#include <cmath>
#include <numbers>

#include "host/core/Tags.h"
#include "host/shape/ClipperUnits.h"
#include "host/shape/Shape.h"

namespace Orvane {

namespace {

namespace CL = ClipperLib;
using clipperunits::kScale;
using clipperunits::ShapeOfPaths;
using clipperunits::ToInt;

struct Vec {
    double x, y;
    Vec operator+(const Vec &o) const { return {x + o.x, y + o.y}; }
    Vec operator-(const Vec &o) const { return {x - o.x, y - o.y}; }
    Vec operator*(double s) const { return {x * s, y * s}; }
    double Dot(const Vec &o) const { return x * o.x + y * o.y; }
    double Cross(const Vec &o) const { return x * o.y - y * o.x; }
    /// The normal on the right of a direction.
    Vec Right() const { return {y, -x}; }
};

Vec UnitDirection(const Vec &from, const Vec &to) {
    const Vec d = to - from;
    const double len = std::hypot(d.x, d.y);
    return len > 0.0 ? d * (1.0 / len) : Vec{1.0, 0.0};
}

/// A flattened sub-path in Clipper units, without repeated points.
struct Polyline {
    std::vector<Vec> points;
    bool closed = false;
};

/// The options of one stroke or offset.
struct OffsetStyle {
    int join = ShapeJoinRound;
    int cap = ShapeCapFlat;
    double miterLimit = ShapeDefaultMiterLimit;
    double tolerance = ShapeDefaultTolerance * kScale; ///< Clipper units

    explicit OffsetStyle(const TagList &tags) {
        join = static_cast<int>(tags.GetLong(ShapeJoin, ShapeJoinRound));
        cap = static_cast<int>(tags.GetLong(ShapeCap, ShapeCapFlat));
        miterLimit = std::max(tags.GetDouble(ShapeMiterLimit, ShapeDefaultMiterLimit), 1.0);
        const double tol = tags.GetDouble(ShapeTolerance, ShapeDefaultTolerance);
        tolerance = (tol > 0.0 && std::isfinite(tol) ? tol : ShapeDefaultTolerance) * kScale;
    }
};

/// Builds the raw loops of one side of a polyline at a signed distance
/// (positive: on the right of its direction).
class OffsetLoopBuilder {
public:
    OffsetLoopBuilder(const OffsetStyle &style, double distance)
        : style_(style), d_(distance), side_(distance < 0.0 ? -1.0 : 1.0) {
        // Chords of arcs as of curves: at most the tolerance long and within a
        // sixteenth of it of the circle, but no coarser than a quarter of the
        // radius away and no finer than a unit.
        const double r = std::abs(distance);
        const double dev = std::clamp(style.tolerance / 16, std::min(0.25, r * 0.25), std::max(r * 0.25, 0.25));
        arcStep_ =
            r > 0.0 ? std::min(2.0 * std::acos(1.0 - dev / r), std::max(style.tolerance / r, 1e-3)) : std::numbers::pi;
    }

    /// The side of `pts` at the builder's distance, with joins at inner
    /// vertices (at every vertex of a closed one).
    void Side(const std::vector<Vec> &pts, bool closed, CL::Path &out) const {
        const size_t n = pts.size();
        auto dir = [&](size_t i) { return UnitDirection(pts[i], pts[(i + 1) % n]); };
        auto len = [&](size_t i) { return std::hypot(pts[(i + 1) % n].x - pts[i].x, pts[(i + 1) % n].y - pts[i].y); };
        auto join = [&](size_t in, size_t at, size_t outSeg) {
            Join(pts[at], dir(in), dir(outSeg), 0.5 * (len(in) + len(outSeg)), out);
        };
        if (closed) {
            for (size_t i = 0; i < n; ++i) join((i + n - 1) % n, i, i);
            return;
        }
        Emit(pts[0] + dir(0).Right() * d_, out);
        for (size_t i = 1; i + 1 < n; ++i) join(i - 1, i, i);
        Emit(pts[n - 1] + dir(n - 2).Right() * d_, out);
    }

    /// The cap at an open end `p` whose last direction is `t`: the points
    /// between p + d n and p - d n (n the right normal), going round the front.
    void Cap(const Vec &p, const Vec &t, CL::Path &out) const {
        const Vec n = t.Right() * d_;
        if (style_.cap == ShapeCapSquare) {
            Emit(p + n + t * std::abs(d_), out);
            Emit(p - n + t * std::abs(d_), out);
        } else if (style_.cap == ShapeCapRound) {
            Arc(p, n, std::numbers::pi * side_, out);
        }
    }

    /// A closed loop round a lone point: a circle for round caps, a square for square ones.
    void Dot(const Vec &p, CL::Path &out) const {
        if (style_.cap == ShapeCapRound) {
            Arc(p, {d_, 0.0}, 2.0 * std::numbers::pi, out);
        } else if (style_.cap == ShapeCapSquare) {
            for (const Vec &c : {Vec{1, -1}, Vec{1, 1}, Vec{-1, 1}, Vec{-1, -1}}) Emit(p + c * std::abs(d_), out);
        }
    }

private:
    void Emit(const Vec &p, CL::Path &out) const {
        out.push_back({clipperunits::Round(p.x), clipperunits::Round(p.y)});
    }

    /// Points from p + v, turning by `angle` (radians, counter-clockwise) about p.
    void Arc(const Vec &p, const Vec &v, double angle, CL::Path &out) const {
        const int steps = std::max(1, static_cast<int>(std::ceil(std::abs(angle) / arcStep_)));
        for (int k = 0; k <= steps; ++k) {
            const double a = angle * k / steps, c = std::cos(a), s = std::sin(a);
            Emit(p + Vec{v.x * c - v.y * s, v.x * s + v.y * c}, out);
        }
    }

    /// The join at p between incoming direction t1 and outgoing t2, the two
    /// segments being `meanLength` long on average.
    void Join(const Vec &p, const Vec &t1, const Vec &t2, double meanLength, CL::Path &out) const {
        const Vec n1 = t1.Right(), n2 = t2.Right();
        const double sinA = t1.Cross(t2), cosA = t1.Dot(t2);
        const Vec a = p + n1 * d_, b = p + n2 * d_;
        // Offsets less than a unit apart on a straight run: one point.
        if (std::abs(sinA * d_) < 1.0 && cosA > 0.0) {
            Emit(a, out);
            return;
        }
        const bool reversal = std::abs(sinA * d_) < 1.0;
        if (!reversal && sinA * d_ < 0.0) {
            // The inner side of the turn. Where the offset folds over (a
            // sharp corner, or a curve bent tighter than the offset: the
            // segments are cut back past their middle on average), the
            // corner point itself keeps the loop's winding right over the
            // fold. Elsewhere the two offsets meet at their crossing, which
            // lies on both: no spike as long as the offset, and no crossing
            // left for the union, at every vertex of a flattened curve.
            if (cosA < 0.99 || std::abs(d_) * std::abs(sinA) / (1.0 + cosA) >= 0.5 * meanLength) {
                Emit(a, out);
                Emit(p, out);
                Emit(b, out);
            } else {
                Emit(p + (n1 + n2) * (d_ / (1.0 + cosA)), out);
            }
            return;
        }
        const double r = 1.0 + n1.Dot(n2); // 2 cos^2 of half the angle between the normals
        const bool miterFits = r >= 2.0 / (style_.miterLimit * style_.miterLimit);
        switch (style_.join) {
        case ShapeJoinRound: Arc(p, n1 * d_, reversal ? std::numbers::pi * side_ : std::atan2(sinA, cosA), out); return;
        case ShapeJoinMiter:
        case ShapeJoinMiterClip:
            if (miterFits) {
                Emit(p + (n1 + n2) * (d_ / r), out);
                return;
            }
            if (style_.join == ShapeJoinMiterClip) {
                // Cut the miter square to its bisector at limit x half width from p.
                const Vec bis = n1 + n2;
                const double bisLen = std::hypot(bis.x, bis.y);
                const Vec u = bisLen > 1e-12 ? bis * (side_ / bisLen) : t1;
                const double along = t1.Dot(u);
                if (along > 1e-12) {
                    const double s = (style_.miterLimit * std::abs(d_) - std::abs(d_) * std::sqrt(r * 0.5)) / along;
                    Emit(a + t1 * s, out);
                    Emit(b - t2 * s, out);
                    return;
                }
            }
            break;
        default: break;
        }
        Emit(a, out); // bevel
        Emit(b, out);
    }

    const OffsetStyle &style_;
    double d_, side_, arcStep_;
};

/// A loop offset towards its inside by `distance` that vanishes: the box's
/// smaller side is no more than twice the distance. Such a loop would come
/// back turned inside out, as a reflected copy winding the same way.
bool CollapsesInward(const std::vector<Vec> &pts, double distance) {
    Vec lo = pts[0], hi = pts[0];
    for (const Vec &p : pts) {
        lo = {std::min(lo.x, p.x), std::min(lo.y, p.y)};
        hi = {std::max(hi.x, p.x), std::max(hi.y, p.y)};
    }
    return std::min(hi.x - lo.x, hi.y - lo.y) <= 2.0 * std::abs(distance);
}

/// Twice the signed area (counter-clockwise positive).
double DoubleArea(const std::vector<Vec> &pts) {
    double a = 0.0;
    for (size_t i = 0, n = pts.size(); i < n; ++i) a += pts[i].Cross(pts[(i + 1) % n]);
    return a;
}

/// The flattened sub-paths in Clipper units; repeated points (after rounding
/// to the grid) and a closing point equal to the first are dropped.
std::vector<Polyline> PolylinesOf(const Shape &flat) {
    std::vector<Polyline> lines;
    for (const Shape::SubPath &sp : flat.SubPaths()) {
        Polyline pl{{}, sp.closed};
        for (const Shape::Vertex &v : sp.points) {
            const CL::IntPoint ip = ToInt(v.x, v.y);
            const Vec p{static_cast<double>(ip.X), static_cast<double>(ip.Y)};
            if (pl.points.empty() || p.x != pl.points.back().x || p.y != pl.points.back().y) pl.points.push_back(p);
        }
        while (pl.points.size() > 1 && pl.points.back().x == pl.points.front().x &&
               pl.points.back().y == pl.points.front().y)
            pl.points.pop_back();
        if (!pl.points.empty()) lines.push_back(std::move(pl));
    }
    return lines;
}

double PolylineLength(const Polyline &pl) {
    double len = 0.0;
    const size_t n = pl.points.size(), segs = pl.closed ? n : n - 1;
    for (size_t i = 0; i < segs; ++i) {
        const Vec d = pl.points[(i + 1) % n] - pl.points[i];
        len += std::hypot(d.x, d.y);
    }
    return len;
}

/// The parts of the polylines between arc lengths `from` and `to` of their
/// whole length (taken one after the other). A closed polyline wholly inside
/// stays closed.
std::vector<Polyline> CutPolylines(const std::vector<Polyline> &lines, double from, double to) {
    std::vector<Polyline> cut;
    double base = 0.0;
    for (const Polyline &pl : lines) {
        const double len = PolylineLength(pl);
        const double a = from - base, b = to - base;
        base += len;
        if (b <= 0.0 || a >= len) continue;
        if (a <= 0.0 && b >= len) {
            cut.push_back(pl);
            continue;
        }
        Polyline part;
        const size_t n = pl.points.size(), segs = pl.closed ? n : n - 1;
        double at = 0.0;
        for (size_t i = 0; i < segs && at < b; ++i) {
            const Vec p = pl.points[i], q = pl.points[(i + 1) % n];
            const double segLen = std::hypot(q.x - p.x, q.y - p.y), end = at + segLen;
            if (end > a && segLen > 0.0) {
                if (part.points.empty()) part.points.push_back(p + (q - p) * (std::max(a - at, 0.0) / segLen));
                part.points.push_back(end <= b ? q : p + (q - p) * ((b - at) / segLen));
            }
            at = end;
        }
        if (!part.points.empty()) cut.push_back(std::move(part));
    }
    return cut;
}

CL::Paths Union(const CL::Paths &loops, CL::PolyFillType rule) {
    CL::Paths result;
    CL::Clipper clipper;
    clipper.AddPaths(loops, CL::ptSubject, true);
    clipper.Execute(CL::ctUnion, result, rule, rule);
    return result;
}

} // namespace

Ref<Shape> Shape::OutlineOfShapeTagList(double width, const TagList &tags) const {
    const OffsetStyle style(tags);
    const double half = std::abs(width) * 0.5 * kScale;
    if (!(half >= 0.5) || !std::isfinite(half)) return MakeRef<Shape>();
    std::vector<Polyline> lines = PolylinesOf(*FlattenOfShapeTagList(tags));
    const double start = std::clamp(tags.GetDouble(ShapeWriteStart, 0.0), 0.0, 1.0);
    const double end = std::clamp(tags.GetDouble(ShapeWriteEnd, 1.0), 0.0, 1.0);
    if (end <= start) return MakeRef<Shape>();
    if (start > 0.0 || end < 1.0) {
        double total = 0.0;
        for (const Polyline &pl : lines) total += PolylineLength(pl);
        lines = CutPolylines(lines, start * total, end * total);
    }
    const OffsetLoopBuilder builder(style, half);
    CL::Paths loops;
    for (Polyline &pl : lines) {
        CL::Path loop;
        if (pl.points.size() == 1) {
            builder.Dot(pl.points[0], loop);
        } else if (pl.closed) {
            // The two sides; the one inside the loop drops out when the pen is wider than the loop.
            const bool inward = CollapsesInward(pl.points, half);
            const bool counterClockwise = DoubleArea(pl.points) > 0.0;
            if (!inward || counterClockwise) builder.Side(pl.points, true, loop);
            loops.push_back(std::move(loop));
            loop.clear();
            std::reverse(pl.points.begin(), pl.points.end());
            if (!inward || !counterClockwise) builder.Side(pl.points, true, loop);
        } else {
            const size_t n = pl.points.size();
            builder.Side(pl.points, false, loop);
            builder.Cap(pl.points[n - 1], UnitDirection(pl.points[n - 2], pl.points[n - 1]), loop);
            std::reverse(pl.points.begin(), pl.points.end());
            builder.Side(pl.points, false, loop);
            builder.Cap(pl.points[n - 1], UnitDirection(pl.points[n - 2], pl.points[n - 1]), loop);
        }
        loops.push_back(std::move(loop));
    }
    try {
        return ShapeOfPaths(Union(loops, CL::pftPositive));
    } catch (const CL::clipperException &) {
        return MakeRef<Shape>();
    }
}

Ref<Shape> Shape::ExpandOfShapeTagList(double amount, bool solid, const TagList &tags) const {
    const OffsetStyle style(tags);
    CL::Paths region;
    for (const Polyline &pl : PolylinesOf(*FlattenOfShapeTagList(tags))) {
        CL::Path path;
        for (const Vec &p : pl.points) path.push_back({static_cast<CL::cInt>(p.x), static_cast<CL::cInt>(p.y)});
        region.push_back(std::move(path));
    }
    try {
        // The filled region as clean contours: outer ones counter-clockwise,
        // holes clockwise, so the right side of each is outside the region.
        region = Union(region, CL::pftNonZero);
        const double d = amount * kScale;
        if (!std::isfinite(d) || std::abs(d) < 0.5) return solid ? ShapeOfPaths(region) : MakeRef<Shape>();
        const OffsetLoopBuilder builder(style, d);
        CL::Paths loops;
        for (const CL::Path &path : region) {
            std::vector<Vec> pts;
            for (const CL::IntPoint &p : path) pts.push_back({static_cast<double>(p.X), static_cast<double>(p.Y)});
            // An outer contour shrinking, or a hole filling in, past its size.
            if ((DoubleArea(pts) > 0.0) == (d < 0.0) && CollapsesInward(pts, d)) continue;
            CL::Path loop;
            builder.Side(pts, true, loop);
            loops.push_back(std::move(loop));
        }
        // Loops of a shrink past the shape turn round, wind negatively and drop out here.
        CL::Paths moved = Union(loops, CL::pftPositive);
        if (solid) return ShapeOfPaths(moved);
        CL::Clipper clipper;
        clipper.AddPaths(d > 0.0 ? moved : region, CL::ptSubject, true);
        clipper.AddPaths(d > 0.0 ? region : moved, CL::ptClip, true);
        CL::Paths border;
        clipper.Execute(CL::ctDifference, border, CL::pftNonZero, CL::pftNonZero);
        return ShapeOfPaths(border);
    } catch (const CL::clipperException &) {
        return MakeRef<Shape>();
    }
}

} // namespace Orvane
