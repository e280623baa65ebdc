// The primitive masks: covered areas against closed forms worked out here (ellipse polygons, rectangles, rounded
// rectangles, triangles, rings, grown and shrunk shapes, a written-on part of a stroke), the data window against the
// box arithmetic, inverting, empty shapes, and the teapot's hole.
#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "tests/operators/mask/MaskRig.h"
#include "tests/support/TestSupport.h"

namespace Orvane::PrimitiveMaskTest {
namespace {
namespace ts = ::Orvane::Test;
using std::numbers::pi;

constexpr int W = ts::MaskRig::W, H = ts::MaskRig::H;
constexpr double kAspect = double(H) / W;

using Rig = ts::MaskRig;

double Area(const Image &m) { return ts::MaskRig::Area(m); }

/// The area of a rectangle of w x h pixels whose corners are quarter circles of radius r drawn as n chords each.
double RoundedRectArea(double w, double h, double r, int n) {
    return w * h - 4 * r * r * (1 - n / 2.0 * std::sin(pi / (2 * n)));
}

/// The points an ellipse mask of radius r pixels with a border of b pixels is drawn with.
int CirclePoints(double r, double b) { return static_cast<int>(std::max(4 * std::sqrt(2.0) * (r + b / 2), 4.0)); }

/// The area of the n-gon inscribed in a circle of radius r, its edges moved out by d (in for negative d; outward
/// corners rounded): the polygon plus its perimeter times d plus a circle of radius d, or the smaller n-gon whose
/// apothem is d shorter.
double MovedPolygonArea(int n, double r, double d) {
    if (d < 0) return n * std::pow(r * std::cos(pi / n) + d, 2) * std::tan(pi / n);
    return n / 2.0 * r * r * std::sin(2 * pi / n) + 2 * n * r * std::sin(pi / n) * d + pi * d * d;
}

TEST(PrimitiveMasks, CoverTheAreasOfTheirShapes) {
    // Vertices are placed on a grid of 1/256 pixel, so an edge may move by 1/512 pixel: the area is exact to the
    // perimeter over 512.
    struct Case {
        const char *cls, *settings;
        double area, perimeter; // pixels
    };
    const double r = 0.2 * W, b = 0.04 * W; // a circle's radius and a border, in pixels
    const int n = CirclePoints(r, 0);
    const Case cases[] = {
        {"EllipseMask", "Width=0.4 Height=0.4", MovedPolygonArea(n, r, 0), 2 * pi * r},
        {"EllipseMask", "Width=0.5 Height=0.2 Angle=30",
         MovedPolygonArea(CirclePoints(std::hypot(0.25, 0.1) * W / std::sqrt(2.0), 0), 1, 0) * 0.25 * W * 0.1 * W,
         2 * pi * 0.25 * W},
        // A solid border grows the radius by half of it; a hollow one is a ring of its width; a negative one shrinks.
        {"EllipseMask", "Width=0.4 Height=0.4 BorderWidth=0.04", MovedPolygonArea(CirclePoints(r, b), r, b / 2),
         2 * pi * r},
        {"EllipseMask", "Width=0.4 Height=0.4 BorderWidth=0.04 Solid=0",
         MovedPolygonArea(CirclePoints(r, b), r, b / 2) - MovedPolygonArea(CirclePoints(r, b), r, -b / 2), 4 * pi * r},
        {"EllipseMask", "Width=0.4 Height=0.4 BorderWidth=-0.1",
         MovedPolygonArea(CirclePoints(r, -0.1 * W), r, -0.05 * W), 2 * pi * r},
        // A border of -2 is limited to the whole diameter: the ellipse vanishes rather than turning inside out.
        {"EllipseMask", "Width=0.4 Height=0.4 BorderWidth=-2", 0.0, 0},
        {"EllipseMask", "Width=0 Height=0.4", 0.0, 0},
        {"RectangleMask", "Width=0.5 Height=0.25", 0.5 * W * 0.25 * W, 0},
        {"RectangleMask", "Width=0.5 Height=0.25 Angle=30", 0.5 * W * 0.25 * W, 1.5 * W},
        {"RectangleMask", "Width=0.5 Height=0.25 BorderWidth=0.02 JoinStyle=2", 0.52 * W * 0.27 * W, 1.58 * W},
        {"RectangleMask", "Width=0.5 Height=0.25 BorderWidth=0.02 JoinStyle=2 Solid=0",
         0.52 * W * 0.27 * W - 0.48 * W * 0.23 * W, 3 * W},
        // Rounded corners of radius c min(hw, hh), each of max(round(W r), 8) chords; radius 1 on a square is a
        // circle.
        {"RectangleMask", "Width=0.5 Height=0.25 CornerRadius=0.5", RoundedRectArea(0.5 * W, 0.25 * W, 0.0625 * W, 16),
         1.5 * W},
        {"RectangleMask", "Width=0.4 Height=0.4 CornerRadius=1", RoundedRectArea(2 * r, 2 * r, r, 51), 2 * pi * r},
        // A hollow rectangle with a negative border draws nothing.
        {"RectangleMask", "Width=0.5 Height=0.25 BorderWidth=-0.02 Solid=0", 0.0, 0},
        // Shoelace of the three points in pixels (Y in frame fractions of the height).
        {"TriangleMask", "", 0.5 * (0.9 - 0.1) * W * (0.9 - 0.1) * H, 2.5 * W},
        // A quarter of the outline of a 0.4 square, from 0.25 to 0.5, stroked 0.02 wide with flat caps: the
        // corner it turns (bevelled) takes (w/2)^2 / 2 of the two straight pieces' overlap away.
        {"RectangleMask", "Width=0.4 Height=0.4 BorderWidth=0.02 Solid=0 WritePosition=0.5 WriteLength=-0.25",
         0.4 * W * 0.02 * W - std::pow(0.01 * W, 2) / 2, 0.8 * W},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.cls) + " " + c.settings);
        Rig rig(c.cls);
        std::string text = c.settings;
        for (size_t at = 0, eq; (eq = text.find('=', at)) != std::string::npos;) {
            const size_t end = std::min(text.find(' ', eq), text.size());
            ts::SetNumber(rig.mask, text.substr(at, eq - at).c_str(), std::stod(text.substr(eq + 1, end - eq - 1)));
            at = end + 1;
        }
        const Ref<Image> m = rig.Render();
        ASSERT_TRUE(m) << ts::ConsoleText(*rig.doc);
        EXPECT_NEAR(Area(*m), c.area, c.perimeter / 512 + 1e-3);
    }
}

TEST(PrimitiveMasks, WriteOnDrawsTheAskedPartOfTheOutline) {
    // From the middle of the right side counter-clockwise: 0.25 to 0.5 of a square's outline is the left half of its
    // top side and the upper half of its left side.
    Rig rig("RectangleMask");
    ts::SetNumbers(rig.mask, {{"Width", 0.4},
                              {"Height", 0.4},
                              {"BorderWidth", 0.02},
                              {"Solid", 0},
                              {"WritePosition", 0.5},
                              {"WriteLength", -0.25}});
    const Ref<Image> m = rig.Render();
    ASSERT_TRUE(m);
    const int cx = W / 2, cy = H / 2, half = static_cast<int>(0.2 * W);
    auto at = [&](int dx, int dy) { return m->GetFlt(cx + dx, cy + dy).A; };
    EXPECT_GT(at(-half / 2, half), 0.9f) << "top side, left half";
    EXPECT_GT(at(-half, half / 2), 0.9f) << "left side, upper half";
    EXPECT_EQ(at(half / 2, half), 0.f) << "top side, right half";
    EXPECT_EQ(at(-half, -half / 2), 0.f) << "left side, lower half";
    EXPECT_EQ(at(half, 0), 0.f) << "right side";
}

TEST(PrimitiveMasks, DataWindowFollowsTheShapesBoxAndInvertFillsTheRest) {
    // An ellipse of diameter 0.25 at (0.3, 0.6): its box in pixels, grown a pixel each way.
    Rig rig("EllipseMask");
    ts::SetNumbers(rig.mask, {{"Width", 0.25}, {"Height", 0.25}});
    ts::SetPoint(rig.mask, "Center", 0.3, 0.6);
    Ref<Image> m = rig.Render();
    ASSERT_TRUE(m);
    // The box of its n = trunc(4 sqrt(2) r) points on the circle of radius r pixels.
    const double cx = 0.3 * W, cy = 0.6 * H, rad = 0.125 * W;
    const int n = static_cast<int>(4 * std::sqrt(2.0) * rad);
    double lo[2] = {1, 1}, hi[2] = {-1, -1};
    for (int i = 0; i < n; ++i) {
        const double c = std::cos(2 * pi * i / n), s = std::sin(2 * pi * i / n);
        lo[0] = std::min(lo[0], c), hi[0] = std::max(hi[0], c), lo[1] = std::min(lo[1], s), hi[1] = std::max(hi[1], s);
    }
    EXPECT_EQ(m->DataWindow(), ImgRectI(int(std::floor(cx + rad * lo[0])) - 1, int(std::floor(cy + rad * lo[1])) - 1,
                                        int(std::ceil(cx + rad * hi[0])) + 1, int(std::ceil(cy + rad * hi[1])) + 1))
        << ts::RectText(m->DataWindow());
    EXPECT_EQ(m->GetCanvasColorFltChan(3), 0.f);
    // Pixels twice as wide as tall: a round mask is twice as many pixels tall as wide.
    ts::SetPoint(rig.mask, "PixelAspect", 2, 1);
    const ImgRectI tall = rig.Render()->DataWindow();
    EXPECT_NEAR(tall.Height() - 2, 2 * (m->DataWindow().Width() - 2), 2) << ts::RectText(tall);
    EXPECT_NEAR(Area(*rig.Render()), 2 * Area(*m), 0.5);
    ts::SetPoint(rig.mask, "PixelAspect", 1, 1);
    // Invert: 1 - coverage inside, canvas 1 outside; the ellipse alone reads 0.99 as not inverted.
    const double covered = Area(*m);
    ts::SetNumber(rig.mask, "Invert", 0.99);
    EXPECT_NEAR(Area(*rig.Render()), covered, 1e-9);
    ts::SetNumber(rig.mask, "Invert", 1);
    m = rig.Render();
    EXPECT_EQ(m->GetCanvasColorFltChan(3), 1.f);
    EXPECT_NEAR(Area(*m), double(W) * H - covered, 1e-3);
    // A shape of no size, inverted, is 1 everywhere.
    ts::SetNumber(rig.mask, "Width", 0);
    EXPECT_NEAR(Area(*rig.Render()), double(W) * H, 1e-9);
}

TEST(PrimitiveMasks, TeapotHasItsHandleHoleAndBounds) {
    Rig rig("TeapotMask");
    ts::SetNumbers(rig.mask, {{"Width", 2}, {"Height", 2}});
    const Ref<Image> m = rig.Render();
    ASSERT_TRUE(m);
    // Teapot space scaled by 2 about the centre: X -0.34296..0.3, Y 0..0.315 (frame widths).
    const ImgRectI dw = m->DataWindow();
    EXPECT_EQ(dw.x0, int(std::floor((0.5 - 0.34296) * W)) - 1);
    EXPECT_EQ(dw.x1, int(std::ceil((0.5 + 0.3) * W)) + 1);
    EXPECT_EQ(dw.y0, int(std::floor(0.5 * kAspect * W)) - 1);
    EXPECT_EQ(dw.y1, int(std::ceil((0.5 * kAspect + 0.315) * W)) + 1);
    auto at = [&](double tx, double ty) {
        return m->GetFlt(int((0.5 + 2 * tx) * W), int((0.5 * kAspect + 2 * ty) * W)).A;
    };
    EXPECT_EQ(at(0.0, 0.06), 1.f) << "the body";
    EXPECT_EQ(at(0.112, 0.075), 0.f) << "inside the handle";
    EXPECT_EQ(at(0.141, 0.075), 1.f) << "the handle";
}

TEST(PrimitiveMasks, AMaskOnAnEffectMaskIsDrawnInTheFrameOfTheImageItLimits) {
    // The document's frame (the mask's own size) is W x H; the image limited is twice as large, with its own pixel
    // aspect. The ellipse must land in the middle of that image, round on its display.
    Rig rig("EllipseMask");
    ts::SetNumbers(rig.mask, {{"Width", 0.5}, {"Height", 0.5}});
    const Ref<Image> out = rig.GainThroughMask(2 * W, 2 * H, 2.0);
    ASSERT_TRUE(out) << ts::ConsoleText(*rig.doc);
    // Radius 0.25 of the width: W/2 pixels across, W/4 pixels up (pixels twice as tall as wide).
    const int cx = W, cy = H;
    const struct {
        int x, y;
        float want;
    } probes[] = {{cx, cy, 0.5f},
                  {cx + W / 2 - 3, cy, 0.5f},
                  {cx + W / 2 + 3, cy, 0.25f},
                  {cx, cy + W / 4 - 3, 0.5f},
                  {cx, cy + W / 4 + 3, 0.25f},
                  {0, 0, 0.25f}};
    for (const auto &p : probes) EXPECT_FLOAT_EQ(out->GetFlt(p.x, p.y).R, p.want) << p.x << "," << p.y;
}

} // namespace
} // namespace Orvane::PrimitiveMaskTest
