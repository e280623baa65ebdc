// Shape geometry: flattening against the true curves, B-splines against their basis functions, stroke and offset
// areas against the areas of the figures they must make.
#include "host/shape/PolyLine.h"
#include "tests/host/shape/ShapeTestSupport.h"

namespace Orvane::shapetest {
namespace {

ShapePoint CubicAt(const ShapePoint c[4], double t) {
    const double u = 1 - t, b0 = u * u * u, b1 = 3 * u * u * t, b2 = 3 * u * t * t, b3 = t * t * t;
    return {b0 * c[0].x + b1 * c[1].x + b2 * c[2].x + b3 * c[3].x,
            b0 * c[0].y + b1 * c[1].y + b2 * c[2].y + b3 * c[3].y};
}

TEST(Shape, BuildingAndReading) {
    Shape s;
    double x = 0, y = 0;
    EXPECT_FALSE(s.GetFirstPoint(x, y));
    EXPECT_TRUE(s.Bounds().IsEmpty());
    s.MoveTo(1, 2);
    s.BezierTo(3, 9, 5, -4, 6, 2);
    s.Close();
    s.LineTo(0, 0); // a segment after Close starts from the closed sub-path's first point
    EXPECT_EQ(s.GetCount(), 6);
    ASSERT_EQ(s.SubPaths().size(), 2u);
    EXPECT_EQ(s.SubPaths()[1].points[0].x, 1);
    EXPECT_TRUE(s.SubPaths()[0].closed);
    EXPECT_FALSE(s.SubPaths()[1].closed);
    EXPECT_FALSE(s.IsFlat());
    ASSERT_TRUE(s.GetFirstPoint(x, y));
    EXPECT_EQ(std::make_pair(x, y), std::make_pair(1.0, 2.0));
    ASSERT_TRUE(s.GetLastPoint(x, y));
    EXPECT_EQ(std::make_pair(x, y), std::make_pair(0.0, 0.0));
    const ShapeBox b = s.Bounds();
    EXPECT_EQ(b.x0, 0);
    EXPECT_EQ(b.y0, -4);
    EXPECT_EQ(b.x1, 6);
    EXPECT_EQ(b.y1, 9);
    s.AddShape(s);
    EXPECT_EQ(s.GetCount(), 12);
    EXPECT_TRUE(s.FlattenOfShapeTagList({})->IsFlat());
}

TEST(Shape, FlatteningTakesStepsOfAtMostTheToleranceCloseToTheCurve) {
    const ShapePoint curves[][4] = {
        {{0, 0}, {0.3, 1}, {0.7, 1}, {1, 0}},    // arch
        {{0, 0}, {1, 1}, {0, 1}, {1, 0}},        // loop
        {{0, 0}, {1, 0.5}, {-0.2, 0.5}, {1, 1}}, // S with a near cusp
        {{0, 0}, {2, 0}, {-1, 0}, {1, 0}},       // doubles back along a line
    };
    for (const auto &c : curves)
        for (double tol : {1e-2, 1e-3, 1e-4}) {
            Shape s;
            s.MoveTo(c[0].x, c[0].y);
            s.BezierTo(c[1].x, c[1].y, c[2].x, c[2].y, c[3].x, c[3].y);
            const Ref<Shape> flat = s.FlattenOfShapeTagList({{ShapeTolerance, tol}});
            const auto &pts = flat->SubPaths().at(0).points;
            EXPECT_EQ(pts.front().x, c[0].x);
            EXPECT_EQ(pts.back().x, c[3].x);
            EXPECT_EQ(pts.back().y, c[3].y);
            // The tolerance is the longest step: chords at most tol long, the curve within tol / 16 of them, and
            // every vertex on the curve.
            constexpr int kSamples = 16384;
            std::vector<ShapePoint> curve;
            double worst = 0, length = 0;
            for (int i = 0; i <= kSamples; ++i) {
                curve.push_back(CubicAt(c, double(i) / kSamples));
                worst = std::max(worst, DistanceToPolyline(curve.back(), *flat));
                if (i) length += std::hypot(curve[i].x - curve[i - 1].x, curve[i].y - curve[i - 1].y);
            }
            EXPECT_LE(worst, tol / 16 * (1 + 1e-9)) << "tolerance " << tol;
            Shape dense;
            for (const ShapePoint &p : curve) dense.LineTo(p.x, p.y);
            for (size_t i = 0; i < pts.size(); ++i) {
                EXPECT_LE(DistanceToPolyline({pts[i].x, pts[i].y}, dense), 1e-6);
                if (i) {
                    EXPECT_LE(std::hypot(pts[i].x - pts[i - 1].x, pts[i].y - pts[i - 1].y), tol * (1 + 1e-9));
                }
            }
            EXPECT_LT(pts.size(), 2 * length / tol + 160 / std::sqrt(tol))
                << "far more chords than the tolerance needs";
        }
}

/// A control point in homogeneous form: position times weight, and the weight.
struct HomCtl {
    double x, y, w;
};

/// The uniform cubic B-spline basis at t of segment s (control points s..s+3), in homogeneous form.
ShapePoint BSplineAt(const std::vector<HomCtl> &p, size_t s, double t) {
    const double b[4] = {(1 - t) * (1 - t) * (1 - t) / 6, (3 * t * t * t - 6 * t * t + 4) / 6,
                         (-3 * t * t * t + 3 * t * t + 3 * t + 1) / 6, t * t * t / 6};
    double x = 0, y = 0, sum = 0;
    for (int k = 0; k < 4; ++k) {
        x += b[k] * p[s + k].x;
        y += b[k] * p[s + k].y;
        sum += b[k] * p[s + k].w;
    }
    return {x / sum, y / sum};
}

TEST(Shape, BSplinesFollowTheirBasisFunctions) {
    const std::vector<ShapePoint> square = {{0, 0}, {1, 0}, {1, 1}, {0, 1}};
    const std::vector<ShapePoint> wave = {{0, 0}, {0.2, 0.5}, {0.5, -0.3}, {0.7, 0.4}, {1, 0}};
    struct Case {
        const std::vector<ShapePoint> *pts;
        std::vector<double> weights; // empty: FlatBSplineTo
        bool closed;
    } cases[] = {
        {&square, {}, true},
        {&square, {1, 1, 1, 1}, true},
        {&square, {4, 1, 1, 1}, true},
        {&wave, {}, false},
        {&wave, {1, 1, 1, 1, 1}, false},
        {&wave, {1, 3, 0.5, 2, 1}, false},
        {&wave, {1, 3, 0.5, 2, 1}, true},
    };
    constexpr double kTol = 1e-4;
    for (const Case &c : cases) {
        const auto &p = *c.pts;
        const int n = int(p.size());
        Shape s;
        if (c.weights.empty())
            s.FlatBSplineTo(p.data(), n, c.closed, {{ShapeTolerance, kTol}});
        else
            s.FlatTBSplineTo(p.data(), c.weights.data(), n, c.closed, {{ShapeTolerance, kTol}});
        // The reference: control points wrapped round (closed), or (open) one more beyond each end, the next
        // point mirrored through the end in homogeneous form (its weight 2 w0 - w1 may be 0 or less).
        std::vector<HomCtl> ext;
        auto hom = [&](int k) {
            const double wk = c.weights.empty() ? 1.0 : c.weights[size_t(k)];
            return HomCtl{p[size_t(k)].x * wk, p[size_t(k)].y * wk, wk};
        };
        auto mirrored = [&](int end, int next) {
            const HomCtl e = hom(end), f = hom(next);
            ext.push_back({2 * e.x - f.x, 2 * e.y - f.y, 2 * e.w - f.w});
        };
        if (!c.closed) mirrored(0, 1);
        for (int i = c.closed ? -1 : 0; i < (c.closed ? n + 2 : n); ++i) ext.push_back(hom((i + n) % n));
        if (!c.closed) mirrored(n - 1, n - 2);
        double worst = 0;
        for (size_t seg = 0; seg + 3 < ext.size(); ++seg)
            for (int i = 0; i <= 200; ++i)
                worst = std::max(worst, DistanceToPolyline(BSplineAt(ext, seg, i / 200.0), s));
        EXPECT_LE(worst, kTol * (1 + 1e-9));
        // Segment joints are on the polyline exactly (they are chord ends).
        for (size_t seg = 0; seg + 3 < ext.size(); ++seg)
            EXPECT_LE(DistanceToPolyline(BSplineAt(ext, seg, 0), s), 1e-12);
        const auto &pts = s.SubPaths().at(0).points;
        if (!c.closed) {
            EXPECT_NEAR(pts.front().x, p.front().x, 1e-12);
            EXPECT_NEAR(pts.back().x, p.back().x, 1e-12);
            EXPECT_NEAR(pts.back().y, p.back().y, 1e-12);
        } else {
            EXPECT_NEAR(pts.front().x, pts.back().x, 1e-12);
        }
        if (c.pts == &square && c.weights.empty()) {
            // Inside the hull, and turning by a quarter about the centre maps the curve onto itself.
            for (const Shape::Vertex &v : pts) {
                EXPECT_TRUE(v.x > 0 && v.x < 1 && v.y > 0 && v.y < 1);
                EXPECT_LE(DistanceToPolyline({1 - v.y, v.x}, s), kTol);
            }
        }
        if (c.weights.size() == 4 && c.weights[0] == 4) {
            // A heavy first point pulls the curve towards it, nearer than the plain curve comes.
            Shape plain;
            plain.FlatBSplineTo(p.data(), n, true, {{ShapeTolerance, kTol}});
            EXPECT_LT(DistanceToPolyline(p[0], s), DistanceToPolyline(p[0], plain) - 0.05);
        }
    }
}

TEST(Shape, BSplinesDrawTheCurvesPolyLinesMeasure) {
    // One rule for both: the chords FlatBSplineTo / FlatTBSplineTo give lie on the curve BSplinePolyLine evaluates,
    // and the line's evenly spaced samples lie on the chords, open and closed, plain and weighted, with 2 to 6 points.
    struct Case {
        std::vector<ShapePoint> pts;
        std::vector<double> weights; // empty: plain
        bool closed;
    } cases[] = {
        {{{0.1, 0.1}, {0.9, 0.3}}, {}, false},
        {{{0.1, 0.1}, {0.4, 0.8}, {0.9, 0.2}}, {}, false},
        {{{0.1, 0.1}, {0.4, 0.8}, {0.9, 0.2}}, {}, true},
        {{{0, 0}, {0.2, 0.5}, {0.5, -0.3}, {0.7, 0.4}, {1, 0}}, {1, 3, 0.5, 2, 1}, false},
        {{{0, 0}, {0.2, 0.5}, {0.5, -0.3}, {0.7, 0.4}, {1, 0}, {0.5, 0.9}}, {2, 1, 1, 0.5, 1, 3}, true},
    };
    constexpr double kTol = 1e-5;
    for (const Case &c : cases) {
        const int n = int(c.pts.size());
        SCOPED_TRACE(std::to_string(n) + (c.closed ? " closed" : " open") + (c.weights.empty() ? "" : " weighted"));
        BSplinePolyLine line({}, c.closed);
        for (int i = 0; i < n; ++i) {
            PolyPoint p;
            p.x = c.pts[size_t(i)].x, p.y = c.pts[size_t(i)].y;
            if (!c.weights.empty()) p.weight = c.weights[size_t(i)];
            line.points.push_back(p);
        }
        Shape s;
        if (c.weights.empty())
            s.FlatBSplineTo(c.pts.data(), n, c.closed, {{ShapeTolerance, kTol}});
        else
            s.FlatTBSplineTo(c.pts.data(), c.weights.data(), n, c.closed, {{ShapeTolerance, kTol}});
        // Chord ends against the line's own segments: each vertex is on the curve, so near some evaluated point.
        Shape dense;
        for (int seg = 0; seg < line.SegmentCount(); ++seg)
            for (int k = 0; k <= 2000; ++k) {
                const PolySample q = *line.PointAt(seg, k / 2000.0);
                seg || k ? dense.LineTo(q.x, q.y) : dense.MoveTo(q.x, q.y);
            }
        for (const Shape::Vertex &v : s.SubPaths().at(0).points) EXPECT_LE(DistanceToPolyline({v.x, v.y}, dense), 1e-6);
        std::vector<PolySample> samples(401);
        ASSERT_EQ(line.GetSamplePoints(401, 1.0, samples.data(), nullptr, 0), 401);
        for (const PolySample &q : samples) EXPECT_LE(DistanceToPolyline({q.x, q.y}, s), kTol * (1 + 1e-9));
        EXPECT_NEAR(samples.front().x, s.SubPaths()[0].points.front().x, 1e-12);
        EXPECT_NEAR(samples.back().y, s.SubPaths()[0].points.back().y, 1e-12);
    }
}

TEST(Shape, StrokeAreasOfCapsAndJoins) {
    // A straight segment of length L; an L-shaped path whose outer corner is a square of h x h beyond the two
    // bands (a miter fills it, a bevel half of it, a round join a quarter disc); a closed square path. Areas hold to
    // the offsetter's integer grid (2^-24 units along the outline).
    const double L = 0.5, w = 0.04, h = w / 2, a = 0.4;
    const double lUnion = 2 * a * h * 2 - h * h; // the two bands of the L, their overlap counted once
    const double clip = (std::sqrt(2.0) - 1.2) * h;
    struct Case {
        const char *name;
        std::vector<ShapePoint> path;
        bool closed;
        int join, cap;
        double limit, area;
    } cases[] = {
        {"flat caps", {{0.1, 0.1}, {0.1 + L, 0.1}}, false, ShapeJoinRound, ShapeCapFlat, 4, L * w},
        {"square caps", {{0.1, 0.1}, {0.1 + L, 0.1}}, false, ShapeJoinRound, ShapeCapSquare, 4, L * w + w * w},
        {"round caps", {{0.1, 0.1}, {0.1 + L, 0.1}}, false, ShapeJoinRound, ShapeCapRound, 4, L * w + M_PI * h * h},
        {"collinear points", {{0, 0}, {0.2, 0}, {0.3, 0}, {L, 0}}, false, ShapeJoinMiter, ShapeCapFlat, 4, L * w},
        {"miter", {{0, 0}, {a, 0}, {a, a}}, false, ShapeJoinMiter, ShapeCapFlat, 4, lUnion + h * h},
        {"bevel", {{0, 0}, {a, 0}, {a, a}}, false, ShapeJoinBevel, ShapeCapFlat, 4, lUnion + h * h / 2},
        {"round", {{0, 0}, {a, 0}, {a, a}}, false, ShapeJoinRound, ShapeCapFlat, 4, lUnion + M_PI * h * h / 4},
        {"miter clip within limit",
         {{0, 0}, {a, 0}, {a, a}},
         false,
         ShapeJoinMiterClip,
         ShapeCapFlat,
         4,
         lUnion + h * h},
        {"miter past limit", {{0, 0}, {a, 0}, {a, a}}, false, ShapeJoinMiter, ShapeCapFlat, 1.2, lUnion + h * h / 2},
        {"miter clip past limit",
         {{0, 0}, {a, 0}, {a, a}},
         false,
         ShapeJoinMiterClip,
         ShapeCapFlat,
         1.2,
         lUnion + h * h - clip * clip},
        {"right turn", {{0, 0}, {a, 0}, {a, -a}}, false, ShapeJoinBevel, ShapeCapFlat, 4, lUnion + h * h / 2},
        {"closed miter", {{0, 0}, {a, 0}, {a, a}, {0, a}}, true, ShapeJoinMiter, ShapeCapRound, 4, 4 * a * w},
        {"closed bevel",
         {{0, 0}, {a, 0}, {a, a}, {0, a}},
         true,
         ShapeJoinBevel,
         ShapeCapFlat,
         4,
         4 * a * w - 2 * h * h},
        {"closed round, clockwise",
         {{0, 0}, {0, a}, {a, a}, {a, 0}},
         true,
         ShapeJoinRound,
         ShapeCapFlat,
         4,
         4 * a * w - (4 - M_PI) * h * h},
    };
    for (const Case &c : cases) {
        Shape s;
        for (const ShapePoint &p : c.path) s.LineTo(p.x, p.y);
        if (c.closed) s.Close();
        const TagList tags{{ShapeJoin, c.join}, {ShapeCap, c.cap}, {ShapeMiterLimit, c.limit}, {ShapeTolerance, 1e-7}};
        for (double width : {w, -w}) // the sign of the width does not matter
            EXPECT_NEAR(SignedArea(*s.OutlineOfShapeTagList(width, tags)), c.area, 1e-7) << c.name;
    }
    Shape dot;
    dot.MoveTo(0.5, 0.5);
    EXPECT_NEAR(SignedArea(*dot.OutlineOfShapeTagList(w, {{ShapeCap, ShapeCapRound}, {ShapeTolerance, 1e-7}})),
                M_PI * h * h, 1e-8);
    EXPECT_TRUE(dot.OutlineOfShapeTagList(w, {{ShapeCap, ShapeCapFlat}})->IsEmpty());
    EXPECT_TRUE(dot.OutlineOfShapeTagList(0, {{ShapeCap, ShapeCapRound}})->IsEmpty());
}

TEST(Shape, WriteOnKeepsTheArcLengthBetweenStartAndEnd) {
    // An L path of two legs of 0.4 with miter joins and flat caps: the stroke of any piece of it (legs longer than
    // the half width) has area width x piece length.
    Shape s;
    s.MoveTo(0, 0);
    s.LineTo(0.4, 0);
    s.LineTo(0.4, 0.4);
    const double w = 0.02, total = 0.8;
    const double ranges[][2] = {{0, 1},     {0.25, 1},   {0, 0.5},   {0.3, 0.7},
                                {0.6, 0.9}, {-0.5, 0.2}, {0.5, 0.5}, {0.7, 0.2}};
    for (const auto &r : ranges) {
        const TagList tags{{ShapeJoin, ShapeJoinMiter}, {ShapeWriteStart, r[0]}, {ShapeWriteEnd, r[1]}};
        const double len = std::max(0.0, std::min(r[1], 1.0) - std::max(r[0], 0.0)) * total;
        EXPECT_NEAR(SignedArea(*s.OutlineOfShapeTagList(w, tags)), w * len, 1e-7) << r[0] << ".." << r[1];
    }
    // A closed square cut to its first half keeps the two sides it covers: an open L of length 2.
    Shape sq;
    for (ShapePoint p : std::vector<ShapePoint>{{0, 0}, {1, 0}, {1, 1}, {0, 1}}) sq.LineTo(p.x, p.y);
    sq.Close();
    const TagList half{{ShapeJoin, ShapeJoinMiter}, {ShapeWriteEnd, 0.5}};
    EXPECT_NEAR(SignedArea(*sq.OutlineOfShapeTagList(w, half)), 2 * w, 1e-7);
}

TEST(Shape, ExpandGrowsAndShrinksTheFilledRegion) {
    const double r = 0.2, s = 0.3;
    const Ref<Shape> circle = Polygon(EllipsePoints(0.5, 0.5, r, r, 4096));
    const double circleArea = SignedArea(*circle);
    const Ref<Shape> square = Polygon({{0, 0}, {0, s}, {s, s}, {s, 0}}); // clockwise: orientation does not matter
    struct Case {
        const char *name;
        const Shape *shape;
        double amount;
        int join;
        bool solid;
        double area;
    } cases[] = {
        {"circle grows", circle.Get(), 0.05, ShapeJoinRound, true, M_PI * 0.25 * 0.25},
        {"circle shrinks", circle.Get(), -0.05, ShapeJoinRound, true, M_PI * 0.15 * 0.15},
        {"circle nearly gone", circle.Get(), -0.19, ShapeJoinMiter, true, M_PI * 0.01 * 0.01},
        {"circle past its radius", circle.Get(), -0.25, ShapeJoinRound, true, 0},
        {"circle border only", circle.Get(), 0.05, ShapeJoinRound, false, M_PI * (0.25 * 0.25 - r * r)},
        {"zero keeps it", circle.Get(), 0, ShapeJoinRound, true, circleArea},
        {"square miter", square.Get(), 0.02, ShapeJoinMiter, true, (s + 0.04) * (s + 0.04)},
        {"square bevel", square.Get(), 0.02, ShapeJoinBevel, true, (s + 0.04) * (s + 0.04) - 2 * 0.02 * 0.02},
        {"square round", square.Get(), 0.02, ShapeJoinRound, true, (s + 0.04) * (s + 0.04) - (4 - M_PI) * 0.0004},
        {"square shrinks", square.Get(), -0.02, ShapeJoinRound, true, (s - 0.04) * (s - 0.04)},
        {"square inner border", square.Get(), -0.02, ShapeJoinBevel, false, s * s - (s - 0.04) * (s - 0.04)},
    };
    for (const Case &c : cases) {
        const Ref<Shape> e =
            c.shape->ExpandOfShapeTagList(c.amount, c.solid, {{ShapeJoin, c.join}, {ShapeTolerance, 1e-7}});
        EXPECT_NEAR(SignedArea(*e), c.area, 1e-7 + c.area * 2e-6) << c.name;
        if (c.area == 0) {
            EXPECT_TRUE(e->IsEmpty()) << c.name;
        }
    }
    // A hole (drawn the other way) closes once the growth passes its radius.
    Shape ring;
    ring.AddShape(*circle);
    ring.AddShape(*Polygon(EllipsePoints(0.5, 0.5, 0.05, -0.05, 2000)));
    EXPECT_NEAR(SignedArea(*ring.ExpandOfShapeTagList(0.01, true, {{ShapeJoin, ShapeJoinRound}})),
                M_PI * (0.21 * 0.21 - 0.04 * 0.04), 1e-4);
    EXPECT_NEAR(SignedArea(*ring.ExpandOfShapeTagList(0.06, true, {{ShapeJoin, ShapeJoinRound}})), M_PI * 0.26 * 0.26,
                1e-4);
}

} // namespace
} // namespace Orvane::shapetest
