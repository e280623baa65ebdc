// The shape tree renderer: combining against the over formula; depths, windows and worker counts against the
// float frame; bad values and abort. (Areas, strokes, order and fields: tests/operators/shape/sRenderTest.cpp.)
#include <limits>

#include "host/core/Parallel.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/shape/ShapeTree.h"
#include "host/shape/ShapeTreeRenderer.h"
#include "tests/host/shape/ShapeTestSupport.h"

namespace Orvane::shapetest::treerender {
namespace {

constexpr int kW = 120, kH = 90;

/// A box given in pixels; `clockwise` runs it the other way.
Ref<Shape> Rect(double x0, double y0, double x1, double y1, bool clockwise = false) {
    std::vector<ShapePoint> p = Box(x0 / kW, y0 / kW, x1 / kW, y1 / kW);
    if (clockwise) std::reverse(p.begin(), p.end());
    return Polygon(p);
}

void Add(ShapeTree &tree, Ref<Shape> shape, const ShapeStyle &style) { AddNode(tree.Root(), std::move(shape), style); }

Ref<Image> Draw(const ShapeTree &tree, bool combine = false, int depth = DepthRGBAFlt32,
                const ImgRectI &window = ImgRectI(0, 0, kW, kH)) {
    Ref<Image> img = NewImageTagList({{ImgWidth, kW}, {ImgHeight, kH}, {ImgDepth, depth}, {ImgDataWindow, &window}});
    ShapeTreeRenderer r;
    r.SetCombine(combine);
    EXPECT_TRUE(r.Render(nullptr, tree, img.Get()));
    return img;
}

TEST(ShapeTreeRenderer, CombiningLaysOverlapsOnceWhateverTheWindingAndOnlyForCombinableStyles) {
    const float a = 0.5f;
    struct Case {
        bool combine, sameStyle, clockwiseSecond;
        double overlapAlpha; ///< worked out from the over formula
    } cases[] = {{true, true, false, a},
                 {true, true, true, a},
                 {false, true, false, a + a * (1 - a)},
                 {true, false, false, a + a * (1 - a)}};
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.combine << c.sameStyle << c.clockwiseSecond);
        ShapeTree tree;
        Add(tree, Rect(10, 10, 60, 50), FillStyle(1, 0, 0, a));
        Add(tree, Rect(40, 30, 100, 80, c.clockwiseSecond),
            c.sameStyle ? FillStyle(1, 0, 0, a) : FillStyle(0, 0, 1, a));
        const Ref<Image> img = Draw(tree, c.combine);
        EXPECT_NEAR(img->GetFlt(50, 40).A, c.overlapAlpha, 1e-6);
        EXPECT_NEAR(img->GetFlt(20, 20).A, a, 1e-6);
        EXPECT_NEAR(img->GetFlt(90, 70).A, a, 1e-6);
        EXPECT_EQ(img->GetFlt(5, 85).A, 0.0f);
    }
}

TEST(ShapeTreeRenderer, DepthsWindowsAndWorkerCountsAgreeWithTheFloatFrame) {
    // A translucent rectangle under a disc with a round-joined line.
    ShapeTree tree;
    Add(tree, Rect(10.3, 5.7, 80.6, 60.2), FillStyle(0.2f, 0.9f, 0.4f, 0.6f));
    ShapeStyle lined = FillStyle(0.9f, 0.3f, 0.1f, 1.0f);
    lined.line = true, lined.lineWidth = 4.5 / kW, lined.join = ShapeJoinRound;
    Add(tree, Polygon(EllipsePoints(70.0 / kW, 45.0 / kW, 30.0 / kW, 22.0 / kW, 256)), lined);
    const Ref<Image> full = Draw(tree);
    struct Case {
        int depth;
        ImgRectI window;
        int workers;
        double tol;
    } cases[] = {
        {DepthRGBAInt8, ImgRectI(0, 0, kW, kH), 0, 0.5 / 255 + 1e-6},
        {DepthRGBAInt16, ImgRectI(0, 0, kW, kH), 0, 0.5 / 65535 + 1e-7},
        {DepthRGBAFlt16, ImgRectI(0, 0, kW, kH), 0, 1e-3},
        // Edges are cut at fixed rows and the frame's sides, whatever the window: the same bits.
        {DepthRGBAFlt32, ImgRectI(17, 33, 101, 71), 0, 0.0},
        {DepthRGBAFlt32, ImgRectI(-20, -10, 60, 200), 0, 0.0},
        {DepthRGBAFlt32, ImgRectI(0, 0, kW, kH), 1, 0.0},
    };
    const int workers = WorkerCount();
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << "depth " << c.depth << " workers " << c.workers);
        SetWorkerCount(c.workers);
        const Ref<Image> img = Draw(tree, false, c.depth, c.window);
        SetWorkerCount(workers);
        for (int y = c.window.y0; y < c.window.y1; ++y)
            for (int x = c.window.x0; x < c.window.x1; ++x) {
                const FltPixel got = img->GetFlt(x, y), want = full->GetFlt(x, y);
                ASSERT_NEAR(got.R, want.R, c.tol) << x << "," << y;
                ASSERT_NEAR(got.A, want.A, c.tol) << x << "," << y;
            }
    }
}

TEST(ShapeTreeRenderer, BadValuesNeitherCrashNorLeaveInvalidPixelsAndAbortStops) {
    const double nan = std::numeric_limits<double>::quiet_NaN(), inf = std::numeric_limits<double>::infinity();
    ShapeTree tree;
    Add(tree, Polygon({{0.1, 0.1}, {nan, 0.2}, {0.3, 0.4}}), FillStyle(1, 1, 1, 1));
    Add(tree, Polygon({{-1e300, -1e300}, {1e300, -1e300}, {0.0, 1e300}}), FillStyle(0.5f, 0.5f, 0.5f, 0.5f));
    Add(tree, Polygon({{0.1, 0.1}, {inf, 0.2}, {0.3, 0.4}}), FillStyle(1, 1, 1, 1));
    ShapeStyle odd = FillStyle(static_cast<float>(nan), 2.0f, -1.0f, 7.0f);
    odd.opacity = nan;
    odd.line = true, odd.lineWidth = 1e9;
    Add(tree, Rect(10, 10, 30, 30), odd);
    odd.opacity = 0.5, odd.lineWidth = -3.0 / kW;
    Add(tree, Rect(40, 10, 60, 30), odd);
    const Ref<Image> img = Draw(tree);
    for (int y = 0; y < kH; ++y)
        for (int x = 0; x < kW; ++x) {
            const FltPixel p = img->GetFlt(x, y);
            ASSERT_TRUE(std::isfinite(p.R) && std::isfinite(p.G) && std::isfinite(p.B)) << x << "," << y;
            ASSERT_TRUE(p.A >= 0.0f && p.A <= 1.0f) << x << "," << y;
        }
    EXPECT_NEAR(img->GetFlt(0, 0).A, 0.5, 1e-5);    // the huge triangle covers everything at its alpha
    EXPECT_NEAR(img->GetFlt(50, 20).A, 0.75, 1e-5); // opacity 0.5 over it; a negative width draws no line
    const Ref<Image> mask = NewImageTagList({{ImgWidth, kW}, {ImgHeight, kH}, {ImgDepth, DepthAFlt32}});
    EXPECT_FALSE(ShapeTreeRenderer().Render(nullptr, tree, mask.Get()));
    RenderTask task;
    Request req(nullptr, nullptr, 0.0, 0, &task);
    task.Abort();
    EXPECT_FALSE(ShapeTreeRenderer().Render(&req, tree, Draw(ShapeTree()).Get()));
}

} // namespace
} // namespace Orvane::shapetest::treerender
