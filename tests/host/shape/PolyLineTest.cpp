#include <algorithm>
#include <cmath>
#include <iostream>
#include <numbers>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"
#include "host/shape/PolyLine.h"
#include "tests/support/TestSupport.h"

namespace Orvane::polylinetest {
namespace ts = ::Orvane::Test;
namespace {

constexpr double kArc = 0.5522847498307936; // 4/3 (sqrt 2 - 1): handles of a quarter circle

PolyPoint P(double x, double y, double rx = 0, double ry = 0, uint32_t flags = 0) {
    PolyPoint p;
    p.x = x, p.y = y, p.rightX = rx, p.rightY = ry, p.leftX = -rx, p.leftY = -ry, p.flags = flags;
    return p;
}

PolyPoint Straight(double x, double y, uint32_t flags = 0) {
    PolyPoint p = P(x, y, 0, 0, flags);
    p.straight = true;
    return p;
}

using Line = Ref<PolyLine>;

/// A circle of radius r about (cx, cy) from four Bezier arcs, starting at angle 0, counter-clockwise.
Line Circle(double cx, double cy, double r, uint32_t marks0 = 0, uint32_t marks2 = 0) {
    const double k = kArc * r;
    return MakeRef<PolyLine>(std::vector<PolyPoint>{P(cx + r, cy, 0, k, marks0), P(cx, cy + r, -k, 0),
                                                    P(cx - r, cy, 0, -k, marks2), P(cx, cy - r, k, 0)},
                             true);
}

Line Square(double x0, double y0, double side, uint32_t marks0 = 0, uint32_t marks2 = 0) {
    return MakeRef<PolyLine>(std::vector<PolyPoint>{Straight(x0, y0, marks0), Straight(x0 + side, y0),
                                                    Straight(x0 + side, y0 + side, marks2), Straight(x0, y0 + side)},
                             true);
}

/// Length by a fine chord sum over the segments' own evaluation, independent of the integration.
double ChordLength(const PolyLine &line, int steps = 20000) {
    double sum = 0;
    for (int s = 0; s < line.SegmentCount(); ++s) {
        PolySample prev = *line.PointAt(s, 0);
        for (int i = 1; i <= steps; ++i) {
            const PolySample p = *line.PointAt(s, double(i) / steps);
            sum += std::hypot(p.x - prev.x, p.y - prev.y);
            prev = p;
        }
    }
    return sum;
}

TEST(PolyLine, LengthsMatchClosedForms) {
    Line open = Square(0.1, 0.1, 0.5);
    open->closed = false;
    Line curvedSides = Square(0.1, 0.1, 0.5); // zero handles: straight, but not marked so
    for (PolyPoint &p : curvedSides->points) p.straight = false;
    const Line line = MakeRef<PolyLine>(std::vector<PolyPoint>{Straight(0, 0), Straight(0.3, 0.4)});
    const Line rail = MakeRef<BSplinePolyLine>(std::vector<PolyPoint>{P(0, 0), P(1, 0), P(2, 0), P(3, 0)});
    const struct {
        const char *name;
        Line line;
        double aspect, want, tolerance;
    } cases[] = {
        {"square", Square(0.1, 0.1, 0.5), 1, 2.0, 1e-15},
        {"open square", open, 1, 1.5, 1e-15},
        {"square as Bezier", curvedSides, 1, 2.0, 1e-12},
        {"square, Y halved", Square(0.1, 0.1, 0.5), 2, 1.5, 1e-15},
        {"line", line, 1, 0.5, 1e-15},
        {"line, aspect 2", line, 2, std::hypot(0.3, 0.2), 1e-15},
        {"line, aspect 0.5", line, 0.5, std::hypot(0.3, 0.8), 1e-15},
        {"line, aspect 0 is 1", line, 0, 0.5, 1e-15},
        // Four arcs stray outward from the circle by up to 2.7e-4 of its radius, so the length by less.
        {"circle", Circle(0.5, 0.5, 0.3), 1, 2 * std::numbers::pi * 0.3, 2 * std::numbers::pi * 0.3 * 2.7e-4},
        {"B-spline on a line", rail, 1, 3.0, 1e-12},
        {"one point", MakeRef<PolyLine>(std::vector<PolyPoint>{P(0.2, 0.2)}, true), 1, 0.0, 0.0},
        {"no points", MakeRef<PolyLine>(), 1, 0.0, 0.0},
    };
    for (const auto &c : cases) EXPECT_NEAR(c.line->CalcLength(c.aspect), c.want, c.tolerance) << c.name;
    // The integration against a fine chord sum, and the circle's error against its known size.
    const Line circle = Circle(0.5, 0.5, 0.3);
    EXPECT_NEAR(circle->CalcLength(1), ChordLength(*circle), 1e-9);
    EXPECT_GT(circle->CalcLength(1) / (2 * std::numbers::pi * 0.3) - 1, 1e-4);
    BSplinePolyLine weighted({P(0, 0), P(0.4, 0.6), P(0.8, 0.1), P(1.0, 0.7)});
    weighted.points[1].weight = 4;
    EXPECT_NEAR(weighted.CalcLength(1), ChordLength(weighted), 1e-9);
}

TEST(PolyLine, SamplesAreEvenlySpacedByArcLength) {
    // Dense samples on smooth curves: each chord is its arc within (step x curvature)^2 / 24.
    const Line s = MakeRef<PolyLine>(
        std::vector<PolyPoint>{P(0.1, 0.1, 0.6, 0.0), P(0.5, 0.5, 0.05, 0.3), P(0.9, 0.2, 0.0, -0.4)});
    for (const Line &line : {Circle(0.5, 0.5, 0.3), s}) {
        const int n = 401;
        std::vector<PolySample> p(n);
        ASSERT_EQ(line->GetSamplePoints(n, 1.0, p.data(), nullptr, 0), n);
        const double step = line->CalcLength(1) / (n - 1);
        for (size_t i = 1; i < n; ++i)
            EXPECT_NEAR(std::hypot(p[i].x - p[i - 1].x, p[i].y - p[i - 1].y), step, step * 1e-3) << "sample " << i;
        EXPECT_TRUE(p[0].x == line->points[0].x && p[0].y == line->points[0].y);
    }
    // With Y measured at a quarter the square's vertical sides count a quarter: of 11 samples, 1 per vertical side.
    std::vector<PolySample> flat(11);
    ASSERT_EQ(Square(0, 0, 1)->GetSamplePoints(11, 4.0, flat.data(), nullptr, 0), 11);
    const double wantX[] = {0, 0.25, 0.5, 0.75, 1, 1, 0.75, 0.5, 0.25, 0, 0},
                 wantY[] = {0, 0, 0, 0, 0, 1, 1, 1, 1, 1, 0};
    for (int i = 0; i < 11; ++i) {
        EXPECT_NEAR(flat[size_t(i)].x, wantX[i], 1e-12) << i;
        EXPECT_NEAR(flat[size_t(i)].y, wantY[i], 1e-12) << i;
    }
}

TEST(PolyLine, MatchedLinesSampledWithMergedSpanCountsFaceEachOther) {
    constexpr uint32_t M = PolyPoint::MatchMark;
    // The inner square's corners 0 and 2 (spans 0 | 0.4 | 0.4) pair with the circle's points at 0 and 90 degrees
    // (spans 0 | a quarter | three quarters).
    const Line innerLine = Square(0.4, 0.4, 0.2, M, M), outerLine = Circle(0.5, 0.5, 0.4, M);
    outerLine->points[1].flags = M;
    const PolyLine &inner = *innerLine, &outer = *outerLine;
    ASSERT_EQ(inner.SpanCount(), 3);
    ASSERT_EQ(outer.GetCount(M), 2);
    const int n = 60;
    int a[3], b[3], merged[3];
    ASSERT_EQ(inner.GetSamplePoints(n, 1, nullptr, a, 3), 3);
    ASSERT_EQ(outer.GetSamplePoints(n, 1, nullptr, b, 3), 3);
    const int wantA[3] = {0, 30, 29}, wantB[3] = {0, 15, 44}; // shares of 59 by length, largest remainders
    int total = 1;
    for (int j = 0; j < 3; ++j) {
        EXPECT_EQ(a[j], wantA[j]) << j;
        EXPECT_EQ(b[j], wantB[j]) << j;
        total += merged[j] = std::max(a[j], b[j]);
    }
    std::vector<PolySample> in(static_cast<size_t>(total)), out(static_cast<size_t>(total));
    ASSERT_EQ(inner.GetSamplePoints(total, 1, in.data(), merged, 3), total);
    ASSERT_EQ(outer.GetSamplePoints(total, 1, out.data(), merged, 3), total);
    // The marked points are the same sample on both lines: the start of span 2.
    const int second = merged[0] + merged[1];
    EXPECT_NEAR(in[size_t(second)].x, 0.6, 1e-12);
    EXPECT_NEAR(in[size_t(second)].y, 0.6, 1e-12);
    EXPECT_NEAR(out[size_t(second)].x, 0.5, 1e-12);
    EXPECT_NEAR(out[size_t(second)].y, 0.9, 1e-12);
    for (int i = 1; i + 1 < total; ++i) {
        const PolySample p = in[size_t(i)], q = out[size_t(i)];
        if (i < second) {
            // Inner along the bottom and right edges in equal steps; outer on the first quarter.
            const double arc = p.y <= 0.4 + 1e-12 ? p.x - 0.4 : 0.2 + p.y - 0.4;
            EXPECT_NEAR(arc, 0.4 * i / merged[1], 1e-12) << i;
            EXPECT_TRUE(q.x >= 0.5 - 1e-12 && q.y >= 0.5 - 1e-12) << i;
        } else if (i > second) {
            EXPECT_GE(p.y, p.x - 1e-12) << i;
            EXPECT_FALSE(q.x > 0.5 + 1e-12 && q.y > 0.5 + 1e-12) << i;
        }
    }
    EXPECT_NEAR(in.back().x, in.front().x, 1e-12);
    EXPECT_NEAR(out.back().y, out.front().y, 1e-12);
    // Counts that do not fit the line are refused; clearing the marks leaves one span.
    int one[1] = {10};
    EXPECT_EQ(inner.GetSamplePoints(total, 1, in.data(), one, 1), 0);
    EXPECT_EQ(inner.GetSamplePoints(n, 1, nullptr, one, 1), 0);
    EXPECT_EQ(inner.GetSamplePoints(3, 1, in.data(), merged, 3), 0);
    auto cleared = MakeRef<PolyLine>(inner.points, true);
    cleared->ClearMatchMarks();
    EXPECT_EQ(cleared->SpanCount(), 1);
    EXPECT_EQ(cleared->GetSamplePoints(n, 1, in.data(), one, 1), 11);
}

TEST(PolyLine, BSplineAndCardinalCurvesMatchHandComputedPoints) {
    // Uniform cubic basis: (1 4 1)/6 at a knot, (1 23 23 1)/48 half way.
    const std::vector<PolyPoint> corners{P(0, 0), P(1, 0), P(1, 1), P(0, 1)};
    BSplinePolyLine square(corners, true), open(corners), rational(corners, true);
    rational.points[1].weight = 3;
    const struct {
        const PolyLine &line;
        int segment;
        double t, x, y;
    } cases[] = {
        {square, 0, 0.0, 1.0 / 6, 1.0 / 6},
        {square, 0, 0.5, 0.5, 1.0 / 24},
        {square, 2, 0.0, 5.0 / 6, 5.0 / 6},
        {rational, 0, 0.0, 3.0 / 8, 1.0 / 8},
        {open, 0, 0.0, 0.0, 0.0},
        {open, 2, 1.0, 0.0, 1.0},
        // Open ends mirror the end points: at the knot of point 1, (2 P0 - P1) + 4 P1 + P2... gives (P0 + 4 P1 + P2)/6.
        {open, 1, 0.0, 5.0 / 6, 1.0 / 6},
    };
    for (const auto &c : cases) {
        const PolySample p = *c.line.PointAt(c.segment, c.t);
        EXPECT_NEAR(p.x, c.x, 1e-14) << c.segment << " " << c.t;
        EXPECT_NEAR(p.y, c.y, 1e-14) << c.segment << " " << c.t;
    }
    EXPECT_FALSE(square.PointAt(4, 0));
    EXPECT_TRUE(square.IsUniform() && !rational.IsUniform());
    // A cardinal spline is the Hermite curve with tangents tension (P[i+1] - P[i-1]).
    for (const bool closed : {false, true})
        for (const double tension : {0.5, 0.2}) {
            CardinalSplinePolyLine card({P(0.1, 0.2), P(0.4, 0.8), P(0.7, 0.3), P(0.9, 0.9)}, closed);
            card.tension = tension;
            const Ref<PolyLine> bezier = card.ToBezier();
            const int n = int(card.points.size());
            auto pt = [&](int i) { return card.points[size_t(closed ? (i + n) % n : std::clamp(i, 0, n - 1))]; };
            for (int s = 0; s < card.SegmentCount(); ++s)
                for (double t : {0.0, 0.3, 0.75, 1.0}) {
                    const double h00 = 2 * t * t * t - 3 * t * t + 1, h10 = t * t * t - 2 * t * t + t,
                                 h01 = -2 * t * t * t + 3 * t * t, h11 = t * t * t - t * t;
                    auto hermite = [&](double PolyPoint::*c) {
                        return h00 * pt(s).*c + h10 * tension * (pt(s + 1).*c - pt(s - 1).*c) + h01 * pt(s + 1).*c +
                               h11 * tension * (pt(s + 2).*c - pt(s).*c);
                    };
                    const PolySample b = *bezier->PointAt(s, t), direct = *card.PointAt(s, t);
                    EXPECT_NEAR(b.x, hermite(&PolyPoint::x), 1e-14) << s << " " << t;
                    EXPECT_NEAR(b.y, hermite(&PolyPoint::y), 1e-14) << s << " " << t;
                    EXPECT_TRUE(b.x == direct.x && b.y == direct.y);
                }
        }
}

Ref<PolyLine> Triangle(double dx, uint32_t flags = 0) {
    return MakeRef<PolyLine>(std::vector<PolyPoint>{P(0 + dx, 0, 0.1, 0, flags), P(1 + dx, 0), P(0.5, 1 + dx)}, true);
}

TEST(PolyLine, KeysBlendPointByPointAndDifferentCountsHold) {
    AnimCurve linear;
    linear.SetKey(0, Triangle(0, PolyPoint::MatchMark));
    linear.SetKey(10, Triangle(1));
    const auto at = [](const AnimCurve &c, double t) {
        const Ref<Parameter> v = c.ValueAt(t);
        return Line(dynamic_cast<PolyLine *>(v.Get()));
    };
    const Line quarter = at(linear, 2.5);
    EXPECT_DOUBLE_EQ(quarter->points[0].x, 0.25);
    EXPECT_DOUBLE_EQ(quarter->points[2].y, 1.25);
    EXPECT_DOUBLE_EQ(quarter->points[0].rightX, 0.1);
    EXPECT_EQ(quarter->points[0].flags, PolyPoint::MatchMark) << "flags come from the earlier key";
    // Smooth over keys 0, 10, 20 with x of point 0 at 0, 1, 3: at 5, Hermite with m0 = 0 (first key) and
    // m1 = (3 - 0) x 10 / 20 = 1.5 gives 0.5 + 0.125 x 0 - 0.125 x 1.5 = 0.3125.
    AnimCurve smooth;
    smooth.SetKey(0, Triangle(0), KeyInterp::Smooth);
    smooth.SetKey(10, Triangle(1), KeyInterp::Smooth);
    smooth.SetKey(20, Triangle(3), KeyInterp::Smooth);
    EXPECT_NEAR(at(smooth, 5)->points[0].x, 0.3125, 1e-15);
    // Point 1 from 10 to 20 (x 2 to 4, 1 before): m0 = (4 - 1) x 10 / 20 = 1.5, m1 = 0 at the last key, so at 15
    // 0.5 x 2 + 0.125 x 1.5 + 0.5 x 4 = 3.1875.
    EXPECT_NEAR(at(smooth, 15)->points[1].x, 3.1875, 1e-15);
    EXPECT_NEAR(at(smooth, 15)->points[2].x, 0.5, 1e-15);
    // A key with another point count: the earlier shape holds until it.
    auto four = MakeRef<PolyLine>(std::vector<PolyPoint>{P(0, 0), P(1, 0), P(1, 1), P(0, 1)}, true);
    for (AnimCurve *c : {&linear, &smooth}) {
        c->SetKey(30, Triangle(5), c == &smooth ? KeyInterp::Smooth : KeyInterp::Linear);
        c->SetKey(40, four);
        for (double t : {30.0, 35.0, 39.99}) EXPECT_TRUE(*at(*c, t) == *Triangle(5)) << t;
        EXPECT_TRUE(*at(*c, 40) == *four);
    }
    // Point 0 from 20 to 30 (x 3 to 5, 1 before; the 4-point key after does not blend, so counts as absent):
    // m0 = (5 - 1) x 10 / 20 = 2, m1 = 0: 0.5 x 3 + 0.125 x 2 + 0.5 x 5 = 4.25 at 25.
    EXPECT_NEAR(at(smooth, 25)->points[0].x, 4.25, 1e-15);
}

class PolyTool : public ThreadedOperator {
public:
    PolyTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        ts::AddIn(this, "Polyline", CLSID_DataType_Polyline);
        ts::AddIn(this, "Outer", CLSID_DataType_BSplinePolyline);
    }
    void Process(Request *) override {}
};

OvID PolyToolID() { return ts::RegisterTool("PolyLineTestTool", &ts::MakeTool<PolyTool>); }

/// A 40-point shape keyed on `frames` frames, positions rounded to `decimals` places.
AnimCurve Animated(int frames, int decimals) {
    std::mt19937 rng(7);
    std::uniform_real_distribution<double> pos(0, 1), handle(-0.05, 0.05);
    const double scale = std::pow(10.0, decimals);
    auto round = [&](double v) { return decimals ? std::round(v * scale) / scale : v; };
    AnimCurve curve;
    for (int f = 0; f < frames; ++f) {
        std::vector<PolyPoint> pts;
        for (int i = 0; i < 40; ++i) {
            pts.push_back(P(round(pos(rng)), round(pos(rng)), round(handle(rng)), round(handle(rng)),
                            i % 10 ? 0 : PolyPoint::MatchMark));
            if (i % 7 == 0) pts.back().leftX = round(handle(rng)); // a broken handle
        }
        curve.SetKey(f, MakeRef<PolyLine>(std::move(pts), true), f % 3 ? KeyInterp::Smooth : KeyInterp::Linear);
    }
    return curve;
}

TEST(PolyLine, DocumentsRoundTripByteForByteAndStaySmall) {
    PolyToolID();
    for (const int decimals : {4, 0}) {
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        Operator *tool = doc->AddTool(PolyToolID(), "Mask1");
        ASSERT_TRUE(tool->FindInput("Polyline")->SetCurve(Animated(200, decimals)));
        BSplinePolyLine outer({P(0.1, 0.2), P(0.5, 0.9), P(0.8, 0.3)}, true);
        outer.points[1].weight = 2.5;
        outer.points[2].z = -1;
        outer.points[2].straight = true;
        outer.aspect = 0.5625;
        ASSERT_TRUE(tool->FindInput("Outer")->SetValue(outer.Copy()));
        const std::string text = SaveDocument(*doc);
        Ref<OrvaneDoc> back = MakeRef<OrvaneDoc>();
        const DocumentLoadResult r = LoadDocument(text, *back);
        ASSERT_TRUE(r.ok) << r.error;
        EXPECT_EQ(SaveDocument(*back), text);
        const Input *in = back->FindTool("Mask1")->FindInput("Polyline");
        EXPECT_TRUE(in->ValueAt(77.5)->Equals(*tool->FindInput("Polyline")->ValueAt(77.5)));
        EXPECT_TRUE(back->FindTool("Mask1")->FindInput("Outer")->ValueAt(0)->Equals(outer));
        // 8000 point keys: with 4 decimals about 46 bytes each, full doubles about 103.
        const double perPoint = double(text.size()) / 8000;
        std::cout << "40 points x 200 keys, " << (decimals ? "4 decimals" : "full precision") << ": " << text.size()
                  << " bytes, " << perPoint << " per point key\n";
        EXPECT_LT(perPoint, decimals ? 50 : 110);
    }
    const BSplinePolyLine shown({P(0.25, 0.5, 0.1, 0)}, true);
    EXPECT_EQ(shown.ToScript().ToText(), "BSplinePolyline { \"0.25 0.5 H 0.1 0\", Closed = true }");
}

TEST(PolyLine, DamagedTextGivesAnErrorWithItsPlace) {
    PolyToolID();
    const std::string head = "Orvane.Document {\n\tTools = {\n\t\tMask1 = PolyLineTestTool {\n\t\t\tInputs = {\n";
    const std::string tail = "\n\t\t\t},\n\t\t},\n\t},\n}\n";
    const struct {
        const char *value, *error;
    } cases[] = {
        {"Polyline = Polyline { \"0.1 0.2\", \"0.3 x\" },",
         "point 2 (line 5, column 43): y 'x' is not a finite number"},
        {"Polyline = Polyline { \"0.1 0.2 H 1\" },", "point 1 (line 5, column 39): missing handle y"},
        {"Polyline = Polyline { \"0.1 0.2 Q 1\" },", "point 1 (line 5, column 36): unknown field 'Q'"},
        {"Polyline = Polyline { \"0.1 0.2 H 1 1 L 0 0\" },", ": field L given twice"},
        {"Polyline = Polyline { \"0.1 0.2 W -2\" },", "point 1 (line 5, column 38): the weight must be above 0"},
        {"Polyline = Polyline { \"0.1 0.2 F 1.5\" },", "flags must be a whole number"},
        {"Polyline = Polyline { \"1e999 0\" },", "x '1e999' is not a finite number"},
        {"Polyline = Polyline { { 0.1, 0.2 } },", "point 1 (line 5, column 27): expects a text \"x y ...\""},
        {"Polyline = Polyline { \"0 0\", Closed = 1 },", "Closed (line 5, column 43): expects true or false"},
        {"Polyline = Polyline { \"0 0\", Tension = 1 },", "unknown entry Tension"},
        {"Polyline = BSplinePolyline { \"0 0\" },", "expects Polyline { \"x y\", ... }, got BSplinePolyline"},
        {"Polyline = Curve { { 0, Polyline { \"0 0\" } }, { 5, Polyline { \"0 z\" } } },", "a key: point 1"},
    };
    for (const auto &c : cases) {
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        const DocumentLoadResult r = LoadDocument(head + "\t\t\t\t" + c.value + tail, *doc);
        EXPECT_FALSE(r.ok) << c.value;
        EXPECT_NE(r.error.find(c.error), std::string::npos) << c.value << "\n got: " << r.error;
        EXPECT_EQ(r.error.rfind("line 5, column 16: Mask1.Polyline: ", 0), 0u) << r.error;
    }
    // Random damage to a saved document never crashes: it loads, or says where it went wrong.
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(doc->AddTool(PolyToolID(), "Mask1")->FindInput("Polyline")->SetCurve(Animated(3, 3)));
    const std::string good = SaveDocument(*doc);
    std::mt19937 rng(11);
    const std::string junk = " {}\",.-e0x9SHLRWZF\n";
    int refused = 0;
    for (int trial = 0; trial < 300; ++trial) {
        std::string bad = good;
        for (int k = 0; k < 3; ++k) bad[rng() % bad.size()] = junk[rng() % junk.size()];
        Ref<OrvaneDoc> d = MakeRef<OrvaneDoc>();
        const DocumentLoadResult r = LoadDocument(bad, *d);
        if (!r.ok) {
            ++refused;
            EXPECT_EQ(r.error.rfind("line ", 0), 0u) << r.error;
        } else { // what still loads saves to a document that loads back to the same text
            const std::string saved = SaveDocument(*d);
            Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
            EXPECT_TRUE(LoadDocument(saved, *again).ok);
            EXPECT_EQ(SaveDocument(*again), saved);
        }
    }
    EXPECT_GT(refused, 100);
}

} // namespace
} // namespace Orvane::polylinetest
