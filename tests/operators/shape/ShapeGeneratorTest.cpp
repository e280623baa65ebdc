// The shape generators against closed forms: areas of ellipses, rounded rectangles, regular polygons and stars,
// the vertices of polygons and stars where the trigonometry puts them, Center mapped through the frame's aspect,
// and the polyline shapes against the masks' own B-spline curve.
#include <cmath>
#include <numbers>
#include <string>
#include <vector>

#include "host/shape/PolyLine.h"
#include "tests/operators/shape/ShapeToolRig.h"

namespace Orvane::shapetest {
namespace {

using std::numbers::pi;

using Generators = Rig;

TEST_F(Generators, AreasMatchClosedForms) {
    // The ellipse's 45-degree Bezier arcs leave the circle outward by at most 4.25e-6 of the radius, so its area
    // is over pi a b by at most 8.5e-6 of it; polygons are exact. Measuring rounds each point to the clipping
    // grid (2^-24) and cuts curves into chords: kSlack covers both.
    struct Case {
        const char *tool;
        std::vector<std::pair<const char *, double>> numbers;
        double area, relTol;
    };
    const double r = 0.05, s = 0.2;
    const Case cases[] = {
        {"sEllipse", {{"Width", 0.6}, {"Height", 0.3}, {"Angle", 30}}, pi * 0.3 * 0.15, 8.5e-6},
        {"sEllipse", {{"Width", 0.2}, {"Height", 0.2}}, pi * 0.01, 8.5e-6},
        {"sRectangle", {{"Width", 0.5}, {"Height", 0.3}, {"Angle", 10}}, 0.15, 0.0},
        {"sRectangle", {{"Width", 0.5}, {"Height", 0.3}, {"CornerRadius", r}}, 0.15 - (4 - pi) * r * r, 1e-6},
        // A radius past half the shorter side is held there: the short sides become half circles.
        {"sRectangle", {{"Width", 0.5}, {"Height", 0.3}, {"CornerRadius", 0.4}}, 0.15 - (4 - pi) * 0.0225, 1e-6},
        {"sNGon", {{"Width", 2 * s}, {"Height", 2 * s}, {"Sides", 3}}, 1.5 * s * s * std::sin(2 * pi / 3), 0.0},
        {"sNGon",
         {{"Width", 2 * s}, {"Height", 2 * s}, {"Sides", 7}, {"Angle", 45}},
         3.5 * s * s * std::sin(2 * pi / 7),
         0.0},
        {"sNGon", {{"Width", 2 * s}, {"Height", s}, {"Sides", 6}}, 3 * s * s * std::sin(pi / 3) / 2, 0.0},
        // n tips at R and n corners at rho R: 2n triangles of area R rho R sin(pi / n) / 2.
        {"sStar",
         {{"Width", 2 * s}, {"Height", 2 * s}, {"Points", 5}, {"InnerRadius", 0.4}},
         5 * s * s * 0.4 * std::sin(pi / 5),
         0.0},
        {"sStar",
         {{"Width", 2 * s}, {"Height", 2 * s}, {"Points", 12}, {"InnerRadius", 0.8}},
         12 * s * s * 0.8 * std::sin(pi / 12),
         0.0},
    };
    for (const Case &c : cases) {
        Operator *op = Add(c.tool, c.numbers);
        const Ref<ShapeTree> tree = Tree(op);
        ASSERT_EQ(tree->NodeCount(), 1) << c.tool;
        const double got = AreaOf(*Top(*tree).GetShape());
        EXPECT_GE(got, c.area - kSlack) << c.tool; // curves lie on or outside their circles
        EXPECT_LE(got, c.area * (1 + c.relTol) + kSlack) << c.tool;
    }
    // A number that is not one (an expression's) draws nothing, in a generator or a modifier, and fails nothing.
    EXPECT_EQ(Top(*Tree(Add("sEllipse", {{"Width", NAN}}))).GetShape(), nullptr);
    EXPECT_EQ(Top(*Tree(Chain("sJitter", Add("sStar"), {{"XAmount", NAN}}))).GetShape(), nullptr);
}

TEST_F(Generators, VerticesSitOnTheirCircleAndCenterFollowsTheAspect) {
    // A 400 x 200 frame: aspect 0.5, so Center (0.25, 0.5) is (0.25, 0.25) in shape units.
    struct Case {
        const char *tool;
        int count;
        double inner, angle;
    };
    const Case cases[] = {{"sNGon", 5, 1.0, 0.0}, {"sNGon", 4, 1.0, 45.0}, {"sStar", 6, 0.3, -20.0}};
    const double rx = 0.15, ry = 0.1, cx = 0.25, cy = 0.25;
    for (const Case &c : cases) {
        Operator *op = Add(c.tool, {{"Width", 2 * rx}, {"Height", 2 * ry}, {"Angle", c.angle}});
        T::SetNumber(op, c.inner < 1 ? "Points" : "Sides", c.count);
        if (c.inner < 1) T::SetNumber(op, "InnerRadius", c.inner);
        T::SetPoint(op, "Center", 0.25, 0.5);
        const Ref<ShapeTree> tree = Tree(op, 400, 200);
        const ShapeNode &node = Top(*tree);
        EXPECT_DOUBLE_EQ(node.AxisX(), cx);
        EXPECT_DOUBLE_EQ(node.AxisY(), cy);
        ASSERT_EQ(node.GetShape()->SubPaths().size(), 1u);
        EXPECT_TRUE(node.GetShape()->SubPaths()[0].closed);
        const std::vector<ShapePoint> got = OnCurve(node.GetShape()->SubPaths()[0]);
        const int n = c.inner < 1 ? 2 * c.count : c.count;
        ASSERT_EQ(static_cast<int>(got.size()), n) << c.tool;
        const double turn = c.angle * pi / 180;
        for (int k = 0; k < n; ++k) {
            // Unturned: vertex k at 90 + 360 k / n degrees on the ellipse, every other one of a star inward.
            const double a = pi / 2 + 2 * pi * k / n, f = (c.inner < 1 && k % 2) ? c.inner : 1.0;
            const double x = rx * f * std::cos(a), y = ry * f * std::sin(a);
            EXPECT_NEAR(got[size_t(k)].x, cx + x * std::cos(turn) - y * std::sin(turn), 1e-14) << c.tool << k;
            EXPECT_NEAR(got[size_t(k)].y, cy + x * std::sin(turn) + y * std::cos(turn), 1e-14) << c.tool << k;
        }
    }
}

/// A line of `pts` (frame fractions about Center), straight segments.
template <class Line> Ref<Line> LineOf(const std::vector<ShapePoint> &pts, bool closed) {
    Ref<Line> line = MakeRef<Line>();
    line->closed = closed;
    for (const ShapePoint &p : pts) {
        PolyPoint q;
        q.x = p.x, q.y = p.y, q.straight = true;
        line->points.push_back(q);
    }
    return line;
}

TEST_F(Generators, PolylineShapesFollowTheMasksMapping) {
    // Frame 400 x 200 (aspect 0.5): a line point (x, y) goes to Center + (x Size, y x 0.5 x Size).
    const std::vector<ShapePoint> square = {{-0.1, -0.1}, {0.1, -0.1}, {0.1, 0.1}, {-0.1, 0.1}};
    Operator *poly = Add("sPolygon", {{"Size", 2.0}});
    ASSERT_TRUE(poly->FindInput("Polyline")->SetValue(LineOf<PolyLine>(square, true)));
    const Ref<ShapeTree> tree = Tree(poly, 400, 200);
    const Shape &closed = *Top(*tree).GetShape();
    EXPECT_NEAR(AreaOf(closed), 0.4 * 0.2, kSlack);
    EXPECT_NEAR(MiddleOf(Top(*tree)).y, 0.25, 1e-15); // Center's Y of 0.5 is half the aspect

    ASSERT_TRUE(poly->FindInput("Polyline")->SetValue(LineOf<PolyLine>(square, false)));
    EXPECT_FALSE(Top(*Tree(poly)).GetShape()->SubPaths().at(0).closed);

    // No line: an empty tree, not a failure.
    Operator *empty = Add("sPolygon");
    EXPECT_EQ(Tree(empty)->NodeCount(), 0);
}

TEST_F(Generators, BSplineShapesAreTheMasksCurveAsBeziers) {
    const std::vector<ShapePoint> pts = {{-0.2, -0.1}, {0.15, -0.2}, {0.25, 0.1}, {0.0, 0.3}, {-0.1, 0.05}};
    for (const bool closed : {true, false}) {
        Operator *op = Add("sBSpline", {{"Angle", 25}});
        T::SetPoint(op, "Center", 0.4, 0.6);
        ASSERT_TRUE(op->FindInput("Polyline")->SetValue(LineOf<BSplinePolyLine>(pts, closed)));
        const Ref<ShapeTree> tree = Tree(op);
        const Shape &got = *Top(*tree).GetShape();
        EXPECT_FALSE(got.IsFlat()); // kept as curves
        // The host's flattened B-spline of the same control points, placed the same way.
        std::vector<ShapePoint> placed;
        const double c = std::cos(25 * pi / 180), s = std::sin(25 * pi / 180);
        for (const ShapePoint &p : pts) placed.push_back({0.4 + p.x * c - p.y * s, 0.6 + p.x * s + p.y * c});
        Shape want;
        want.FlatBSplineTo(placed.data(), static_cast<int>(placed.size()), closed, {{ShapeTolerance, 1e-5}});
        if (closed) want.Close();
        EXPECT_NEAR(AreaOf(got), AreaOf(want), kSlack) << closed;
        double x0, y0, x1, y1; // an open curve runs from the first control point to the last
        ASSERT_TRUE(got.GetFirstPoint(x0, y0) && got.GetLastPoint(x1, y1));
        if (!closed) {
            EXPECT_NEAR(std::hypot(x0 - placed[0].x, y0 - placed[0].y) + std::hypot(x1 - placed[4].x, y1 - placed[4].y),
                        0.0, 1e-15);
        }
    }
}

TEST_F(Generators, GridHasALineBarPerGridLine) {
    const int across = 4, down = 3;
    const double w = 0.6, h = 0.3, t = 0.01;
    Operator *op =
        Add("sGrid", {{"CellsAcross", across}, {"CellsDown", down}, {"Width", w}, {"Height", h}, {"LineThickness", t}});
    const Ref<ShapeTree> tree = Tree(op);
    ASSERT_EQ(tree->NodeCount(), (across + 1) + (down + 1));
    for (int i = 0; i <= across; ++i) // vertical bars first, left to right, the axis at the middle of each
        EXPECT_NEAR(Top(*tree, size_t(i)).AxisX(), 0.5 - w / 2 + w * i / across, 1e-15);
    // The bars' union: every bar, less each crossing counted twice.
    ClipPaths all;
    ShapeOperator::AddShapeUnionToPaths(*tree, all, kMeasureStep, true);
    const double want = (across + 1) * t * (h + t) + (down + 1) * (w + t) * t - (across + 1) * (down + 1) * t * t;
    EXPECT_NEAR(FilledArea(all), want, kSlack);
}

} // namespace
} // namespace Orvane::shapetest
