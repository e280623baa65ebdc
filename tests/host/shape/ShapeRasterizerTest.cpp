// Scan conversion: summed coverage against the areas of the figures, partial pixels against the overlap of an
// edge, fill rules, pixel aspect, windows, depths, threads and abort.
#include <cstring>

#include "host/core/Parallel.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/shape/ShapeRasterizer.h"
#include "tests/host/shape/ShapeTestSupport.h"

namespace Orvane::shapetest {
namespace {

constexpr int kW = 160, kH = 120;

Ref<Image> Mask(int depth = DepthAFlt32, const ImgRectI &window = ImgRectI(0, 0, kW, kH), double yScale = 1.0) {
    return NewImageTagList(
        {{ImgWidth, kW}, {ImgHeight, kH}, {ImgDepth, depth}, {ImgDataWindow, &window}, {ImgYScale, yScale}});
}

Ref<Image> Render(const Shape &s, int rule = ShapeWindingNonZero, bool invert = false, int depth = DepthAFlt32,
                  const ImgRectI &window = ImgRectI(0, 0, kW, kH)) {
    Ref<Image> m = Mask(depth, window);
    EXPECT_TRUE(ShapeRasterizerInputs(nullptr).Rasterize(nullptr, s, m.Get(), invert, rule));
    return m;
}

double At(const Image &m, int x, int y) { return m.GetFlt(x, y).A; }

double Sum(const Image &m) {
    double sum = 0;
    const ImgRectI w = m.DataWindow();
    for (int y = w.y0; y < w.y1; ++y)
        for (int x = w.x0; x < w.x1; ++x) sum += At(m, x, y);
    return sum;
}

/// A polygon given in pixels, in the mask's shape units (X and Y over the width).
Ref<Shape> InPixels(const std::vector<ShapePoint> &px, double deg = 0, double cx = 80, double cy = 60) {
    std::vector<ShapePoint> pts;
    for (const ShapePoint &p : px) pts.push_back({p.x / kW, p.y / kW});
    return Polygon(pts, deg, cx / kW, cy / kW);
}

TEST(ShapeRasterizer, SummedCoverageIsTheArea) {
    struct Figure {
        const char *name;
        std::vector<ShapePoint> (*points)(double size);
        double (*area)(double size);
    } figures[] = {
        {"ellipse", [](double r) { return EllipsePoints(80, 60, r, 0.6 * r, 4096); },
         [](double r) { return M_PI * r * 0.6 * r; }},
        {"rectangle",
         [](double r) {
             return std::vector<ShapePoint>{
                 {80 - r, 60 - r / 3}, {80 + r, 60 - r / 3}, {80 + r, 60 + r / 3}, {80 - r, 60 + r / 3}};
         },
         [](double r) { return 2 * r * 2 * r / 3; }},
        {"rounded rectangle", [](double r) { return RoundedRectPoints(80 - r, 60 - r / 2, 2 * r, r, r / 4, 1024); },
         [](double r) { return 2 * r * r - (4 - M_PI) * r * r / 16; }},
        {"triangle",
         [](double r) {
             return std::vector<ShapePoint>{{80 - r, 60 - r / 2}, {80 + r, 60 - r / 3}, {80 + r / 5, 60 + r / 2}};
         },
         [](double r) { return 0.9 * r * r; }},
    };
    for (const Figure &f : figures)
        for (double size : {1.3, 7.7, 24.9, 49.2})
            for (double deg : {0.0, 17.0, 45.0, 90.0}) {
                const std::vector<ShapePoint> pts = f.points(size);
                double perimeter = 0;
                for (size_t i = 0; i < pts.size(); ++i)
                    perimeter +=
                        std::hypot(pts[(i + 1) % pts.size()].x - pts[i].x, pts[(i + 1) % pts.size()].y - pts[i].y);
                // Vertices land on a 1/256 pixel grid: each edge moves by at most half a step.
                const double tol = perimeter / 512 + 1e-3;
                const Ref<Image> m = Render(*InPixels(pts, deg));
                EXPECT_NEAR(Sum(*m), f.area(size), tol) << f.name << " size " << size << " at " << deg;
                EXPECT_NEAR(Sum(*Render(*InPixels(pts, deg), ShapeWindingNonZero, true)), kW * kH - f.area(size), tol);
            }
}

TEST(ShapeRasterizer, EdgesAtFractionalPositionsCoverTheirShare) {
    struct Case {
        double x0, y0, x1, y1; // rectangle in pixels
        int px, py;            // a pixel
        double want;           // its covered area
    } cases[] = {
        {10.25, 5, 20.75, 9, 10, 6, 0.75},     {10.25, 5, 20.75, 9, 20, 6, 0.75}, {10.25, 5, 20.75, 9, 15, 6, 1},
        {10.25, 5, 20.75, 9, 9, 6, 0},         {10.25, 5, 20.75, 9, 21, 6, 0},    {10, 5.125, 20, 9.5, 12, 5, 0.875},
        {10, 5.125, 20, 9.5, 12, 9, 0.5},      {10, 5.125, 20, 9.5, 12, 10, 0},   {10.3, 5.6, 20, 9, 10, 5, 0.7 * 0.4},
        {3.2, 4.1, 3.7, 4.5, 3, 4, 0.5 * 0.4}, {0, 0, 160, 0.01, 50, 0, 0.01},
    };
    for (const Case &c : cases) {
        const Ref<Image> m = Render(*InPixels({{c.x0, c.y0}, {c.x1, c.y0}, {c.x1, c.y1}, {c.x0, c.y1}}, 0));
        // Quarters and eighths sit on the 1/256 grid and come out exact; other fractions within the grid's reach.
        EXPECT_NEAR(At(*m, c.px, c.py), c.want, 1.0 / 256) << c.x0 << "," << c.y0 << " pixel " << c.px << "," << c.py;
        if (c.want * 8 == std::floor(c.want * 8)) {
            EXPECT_EQ(At(*m, c.px, c.py), c.want);
        }
    }
    // A diagonal edge through pixel (5, 5) from its lower left to its upper right corner covers half of it.
    EXPECT_DOUBLE_EQ(At(*Render(*InPixels({{0, 0}, {10, 10}, {10, 0}}, 0)), 5, 5), 0.5);
}

TEST(ShapeRasterizer, FillRulesOnOverlapsAndHoles) {
    // Two squares overlapping over [40, 60) x [40, 60); the second drawn the same way or the other way.
    const std::vector<ShapePoint> a = {{20, 20}, {60, 20}, {60, 60}, {20, 60}};
    const std::vector<ShapePoint> same = {{40, 40}, {80, 40}, {80, 80}, {40, 80}};
    const std::vector<ShapePoint> reversed = {{40, 40}, {40, 80}, {80, 80}, {80, 40}};
    struct Case {
        const std::vector<ShapePoint> *second;
        int rule;
        bool invert;
        double overlap, single;
    } cases[] = {
        {&same, ShapeWindingNonZero, false, 1, 1},     {&same, ShapeWindingEvenOdd, false, 0, 1},
        {&reversed, ShapeWindingNonZero, false, 0, 1}, {&reversed, ShapeWindingEvenOdd, false, 0, 1},
        {&same, ShapeWindingEvenOdd, true, 1, 0},
    };
    for (const Case &c : cases) {
        Shape s;
        s.AddShape(*InPixels(a));
        s.AddShape(*InPixels(*c.second));
        const Ref<Image> m = Render(s, c.rule, c.invert);
        EXPECT_EQ(At(*m, 50, 50), c.overlap);
        EXPECT_EQ(At(*m, 30, 30), c.single);
        EXPECT_EQ(At(*m, 70, 70), c.single);
        EXPECT_EQ(At(*m, 10, 70), c.invert ? 1 : 0);
    }
}

TEST(ShapeRasterizer, CurvesStrokesAndPixelAspect) {
    // A circle of radius 30 px drawn as four Bezier quarters (radius error 0.03%) is flattened on the way in.
    constexpr double k = 0.5522847498, r = 30.0 / kW, cx = 0.5, cy = 60.0 / kW;
    Shape c;
    c.MoveTo(cx + r, cy);
    c.BezierTo(cx + r, cy + k * r, cx + k * r, cy + r, cx, cy + r);
    c.BezierTo(cx - k * r, cy + r, cx - r, cy + k * r, cx - r, cy);
    c.BezierTo(cx - r, cy - k * r, cx - k * r, cy - r, cx, cy - r);
    c.BezierTo(cx + k * r, cy - r, cx + r, cy - k * r, cx + r, cy);
    c.Close();
    EXPECT_NEAR(Sum(*Render(c)), M_PI * 900, M_PI * 900 * 1e-3);
    // Its stroke of 4 px: the ring between radii 28 and 32.
    const Ref<Shape> ring = c.OutlineOfShapeTagList(4.0 / kW, {{ShapeTolerance, 0.01 / kW}});
    EXPECT_NEAR(Sum(*Render(*ring, ShapeWindingEvenOdd)), M_PI * (32 * 32 - 28 * 28), 1.0);
    // Pixels twice as tall as wide: shape Y 0.25 lies at row 0.25 * W / 2 = 20.
    Ref<Image> tall = Mask(DepthAFlt32, ImgRectI(0, 0, kW, kH), 2.0);
    ASSERT_TRUE(ShapeRasterizerInputs(nullptr).Rasterize(nullptr, *Polygon({{0, 0}, {1, 0}, {1, 0.25}, {0, 0.25}}),
                                                         tall.Get(), false, ShapeWindingNonZero));
    EXPECT_EQ(At(*tall, 7, 19), 1);
    EXPECT_EQ(At(*tall, 7, 20), 0);
    EXPECT_EQ(Sum(*tall), kW * 20);
}

TEST(ShapeRasterizer, WindowsDepthsAndThreadsAgree) {
    const Ref<Shape> s = InPixels(EllipsePoints(80, 60, 47.3, 33.1, 777), 23);
    const Ref<Image> full = Render(*s);
    // A window that is only part of the frame, and one that reaches beyond it.
    for (const ImgRectI &w : {ImgRectI(50, 31, 97, 70), ImgRectI(-20, -10, 90, 140)}) {
        const Ref<Image> part = Render(*s, ShapeWindingNonZero, false, DepthAFlt32, w);
        for (int y = w.y0; y < w.y1; ++y)
            for (int x = w.x0; x < w.x1; ++x) ASSERT_NEAR(At(*part, x, y), At(*full, x, y), 2.0 / 256) << x << "," << y;
    }
    // Every depth stores the float coverage to its own precision.
    const double steps[] = {0, 0.5 / 255, 0.5 / 65535, 1.0 / 2048, 0};
    for (int depth : {DepthAInt8, DepthAInt16, DepthAFlt16}) {
        const Ref<Image> m = Render(*s, ShapeWindingNonZero, false, depth);
        for (int y = 0; y < kH; ++y)
            for (int x = 0; x < kW; ++x) ASSERT_NEAR(At(*m, x, y), At(*full, x, y), steps[depth] + 1e-7) << depth;
    }
    // One worker or several: the same bits.
    const int workers = WorkerCount();
    SetWorkerCount(1);
    const Ref<Image> one = Render(*s, ShapeWindingEvenOdd, true);
    SetWorkerCount(4);
    const Ref<Image> four = Render(*s, ShapeWindingEvenOdd, true);
    SetWorkerCount(workers);
    for (int y = 0; y < kH; ++y) ASSERT_EQ(std::memcmp(one->ScanLine(y), four->ScanLine(y), one->RowBytes()), 0);
}

TEST(ShapeRasterizer, FailsOnAbortAndOnImagesThatAreNoMasks) {
    const Ref<Shape> s = InPixels(EllipsePoints(80, 60, 20, 20, 64));
    RenderTask task;
    Request req(nullptr, nullptr, 0.0, 0, &task);
    Ref<Image> m = Mask();
    const ShapeRasterizerInputs ras(nullptr);
    EXPECT_TRUE(ras.Rasterize(&req, *s, m.Get(), false, ShapeWindingNonZero));
    task.Abort();
    EXPECT_FALSE(ras.Rasterize(&req, *s, m.Get(), false, ShapeWindingNonZero));
    Ref<Image> rgba = NewImageTagList({{ImgWidth, kW}, {ImgHeight, kH}, {ImgDepth, DepthRGBAFlt32}});
    EXPECT_FALSE(ras.Rasterize(nullptr, *s, rgba.Get(), false, ShapeWindingNonZero));
    EXPECT_FALSE(ras.Rasterize(nullptr, *s, nullptr, false, ShapeWindingNonZero));
    // An empty shape fills with 0, or 1 inverted.
    EXPECT_EQ(Sum(*Render(Shape(), ShapeWindingNonZero, true)), kW * kH);
    EXPECT_EQ(Sum(*Render(Shape())), 0);
}

} // namespace
} // namespace Orvane::shapetest
