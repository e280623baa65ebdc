// Spline curves: values worked out by hand from the monotone cubic's definition, the shape it promises (through its
// points, monotone, smooth, straight lines kept), periodic wrapping, the document form.
#include <cmath>

#include <gtest/gtest.h>

#include "host/color/SplineCurve.h"

namespace Orvane {
namespace {

using Points = std::vector<CurvePoint>;

TEST(SplineCurve, ValuesWorkedOutByHand) {
    // (0,0) (0.5,0.25) (1,1): chords 0.5 and 1.5, slopes 0.5, 1, 1.5 (no overshoot to scale); at t = 1/2 the Hermite
    // weights are 1/2, h/8, 1/2, -h/8. Beyond the ends: straight with the end slopes. (0,0) (0.1,1) (1,1): the
    // slope at 0.1 is 0 where the chords turn; flat after it. (0.25,1) (0.75,-1) periodic: both slopes 0, so each
    // half turn is the step 3t^2 - 2t^3.
    const struct {
        Points points;
        bool periodic;
        double x, y;
    } cases[] = {
        {{{0, 0}, {0.5, 0.25}, {1, 1}}, false, 0.25, 0.09375},
        {{{1, 1}, {0, 0}, {0.5, 0.25}}, false, 0.75, 0.59375},
        {{{0, 0}, {0.5, 0.25}, {1, 1}}, false, -0.5, -0.25},
        {{{0, 0}, {0.5, 0.25}, {1, 1}}, false, 2.0, 2.5},
        {{{0, 0}, {0.1, 1}, {1, 1}}, false, 0.05, 0.625},
        {{{0, 0}, {0.1, 1}, {1, 1}}, false, 0.6, 1.0},
        {{{0.25, 1}, {0.75, -1}}, true, 0.5, 0.0},
        {{{0.25, 1}, {0.75, -1}}, true, 0.375, 0.6875},
        {{{0.25, 1}, {0.75, -1}}, true, 0.0, 0.0},
        {{{0.25, 1}, {0.75, -1}}, true, -2.625, 0.6875},
        {{{0.25, 1}, {0.75, -1}}, true, 1.625, -0.6875},
        {{{0.4, 0.7}}, false, 9.0, 0.7},
        {{{0.4, 0.7}}, true, 0.9, 0.7},
    };
    for (const auto &c : cases) {
        const Spline s = SplineCurve(c.points).ToSpline(c.periodic);
        EXPECT_NEAR(s(c.x), c.y, 1e-15) << "x = " << c.x << (c.periodic ? " periodic" : "");
    }
}

TEST(SplineCurve, PassesThroughItsPointsStaysMonotoneAndSmooth) {
    const Points shapes[] = {
        {{0, 0}, {0.2, 0.6}, {0.3, 0.65}, {0.9, 0.95}, {1, 1}}, // rising, with a sharp bend that would overshoot
        {{0, 1}, {0.1, 0.2}, {0.7, 0.1}, {1, 0}},               // falling
        {{0, 0.2}, {0.35, 0.9}, {0.5, 0.1}, {0.8, 0.8}},        // up and down
        {{0.1, 0.5}, {0.3, 2}, {0.95, -1}},                     // periodic below
    };
    for (size_t n = 0; n < std::size(shapes); ++n) {
        const bool periodic = n == 3;
        const Points &pts = shapes[n];
        const Spline s = SplineCurve(pts).ToSpline(periodic);
        for (const CurvePoint &p : pts) EXPECT_NEAR(s(p.x), p.y, 1e-15) << n;
        for (size_t k = 0; k < pts.size(); ++k) {
            const CurvePoint a = pts[k], b = k + 1 < pts.size() ? pts[k + 1] : CurvePoint{pts[0].x + 1, pts[0].y};
            if (!periodic && k + 1 == pts.size()) break;
            double last = a.y;
            for (int i = 1; i <= 200; ++i) { // between two points the curve moves one way only, and stays between them
                const double x = a.x + (b.x - a.x) * i / 200, y = s(x);
                EXPECT_GE((y - last) * (b.y - a.y), -1e-15) << n << " at " << x;
                EXPECT_LE(std::min(a.y, b.y) - 1e-15, y);
                EXPECT_LE(y, std::max(a.y, b.y) + 1e-15);
                last = y;
                // The slope is the derivative of the values, and it is continuous at the points.
                const double e = 1e-6;
                EXPECT_NEAR(s.Slope(x), (s(x + e) - s(x - e)) / (2 * e), 1e-3 * (1 + std::fabs(s.Slope(x))));
            }
            EXPECT_NEAR(s.Slope(b.x - 1e-9), s.Slope(b.x + 1e-9), 1e-6) << n;
        }
        if (periodic) {
            for (double x : {0.0, 0.05, 0.5, 0.99}) EXPECT_NEAR(s(x), s(x + 3), 1e-12);
        }
    }
    // Points on one straight line give that line, beyond the ends too.
    const Spline line = SplineCurve({{-0.2, -0.3}, {0.1, 0.3}, {0.15, 0.4}, {0.9, 1.9}}).ToSpline(false);
    for (double x : {-3.0, -0.2, 0.0, 0.12, 0.5, 0.9, 4.0}) EXPECT_NEAR(line(x), 2 * x + 0.1, 1e-14) << x;
}

TEST(SplineCurve, DocumentFormRoundTripsAndPeriodicCurvesKeepToOneTurn) {
    const SplineCurve curve({{0.7, 0.2}, {0, 0.1}, {0.3, 1e-17}});
    const Ref<SplineCurve> back = SplineCurve::FromScript(curve.ToScript());
    ASSERT_TRUE(back);
    EXPECT_TRUE(back->Equals(curve) && back->Hash() == curve.Hash());
    EXPECT_EQ(back->Points().front(), (CurvePoint{0, 0.1}));
    EXPECT_FALSE(SplineCurve().Equals(*SplineCurve::Flat(0)));
    // Open curves may reach anywhere; periodic ones hold their points in one turn (the tool tests check the rest).
    EXPECT_EQ(SplineCurve({{-0.25, 0}, {1.5, 1}}).Problem(false), "");
    EXPECT_EQ(SplineCurve({{0, 0}, {0.999, 1}}).Problem(true), "");
    EXPECT_EQ(SplineCurve({{-0.25, 0}, {0.5, 1}}).Problem(true), "has a point outside 0 <= x < 1 (x = -0.25)");
}

} // namespace
} // namespace Orvane
