// Scale: the parity rule worked by hand, fields and proxies, the window's
// reach, a size of zero, pixels against the host's resizer called directly,
// and regions of interest against whole frames.
#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest::ScaleT {
namespace {

class ScaleTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    Operator *Make(Ref<Image> src, double x, double y = -1.0) {
        probe = AddProbe(doc, std::move(src));
        Operator *scl = AddTool(doc, "Scale", probe);
        SetNumber(scl, "XSize", x);
        if (y >= 0.0) {
            SetNumber(scl, "LockXY", 0);
            SetNumber(scl, "YSize", y);
        }
        return scl;
    }
    OrvaneDoc doc;
    ProbeSource *probe = nullptr;
};

/// An image of w x h without pixels: enough for the windows.
Ref<Image> Frame(int w, int h) { return NewImageTagList({{ImgWidth, w}, {ImgHeight, h}}); }

TEST_F(ScaleTool, TheSizeKeepsItsParity) {
    // x = w / 2 x s; odd w: ceil(x - 1/2) + 1/2, even w: ceil(x); side = truncate(2x + 1/2).
    struct Case {
        int w;
        double s;
        int expected;
    };
    const Case cases[] = {{5, 1.0, 5},  {5, 0.5, 3}, {6, 0.5, 4},      {7, 0.5, 5},      {4, 1.3, 6}, {9, 2.0, 19},
                          {8, 0.25, 2}, {1, 0.1, 1}, {1920, 0.5, 960}, {1921, 0.5, 961}, {3, 3.0, 9}, {2, 0.01, 2}};
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.w << " at " << c.s);
        OrvaneDoc d;
        Operator *scl = AddTool(d, "Scale", AddProbe(d, Frame(c.w, 10)));
        SetNumber(scl, "XSize", c.s);
        Ref<Image> shape = Shape(scl);
        ASSERT_NE(shape, nullptr);
        EXPECT_EQ(shape->Width(), c.expected);
        EXPECT_EQ(shape->Width() % 2, c.w % 2);
    }
}

TEST_F(ScaleTool, FieldsCountTheirFramesHeightAndProxiesDivide) {
    // A field of a 40 x 30 frame: 30 at 0.5 gives 7.5, up to 8: 16 lines, 8 per field.
    Ref<Image> field = NewImageTagList({{ImgWidth, 40}, {ImgHeight, 15}, {ImgYScale, 2.0}, {ImgField, 0}});
    Operator *scl = Make(field, 0.5);
    Ref<Image> shape = Shape(scl);
    ASSERT_NE(shape, nullptr);
    EXPECT_EQ(shape->Width(), 20);
    EXPECT_EQ(shape->Height(), 8);

    // A half-size proxy of a 45 x 30 frame, scaled by 1.2: 45 x 0.6 = 27 (odd),
    // ceil(26.5) + 0.5 = 27.5 -> 55; 30 x 0.6 = 18 -> 36; halved: 27 x 18.
    OrvaneDoc d;
    Ref<Image> proxy = NewImageTagList({{ImgWidth, 22}, {ImgHeight, 15}, {ImgFullWidth, 45}, {ImgFullHeight, 30}});
    Operator *scl2 = AddTool(d, "Scale", AddProbe(d, proxy));
    SetNumber(scl2, "XSize", 1.2);
    shape = Shape(scl2, {.proxy = 2});
    ASSERT_NE(shape, nullptr);
    EXPECT_EQ(shape->Width(), 27);
    EXPECT_EQ(shape->Height(), 18);
    EXPECT_EQ(shape->GetAttrL(ImgFullWidth), 55);
    EXPECT_EQ(shape->GetAttrL(ImgFullHeight), 36);
}

TEST_F(ScaleTool, TheWindowGrowsByTheFiltersReach) {
    // Linear (radius 1) at 0.5 reaches 2 source pixels: (0 - 2) x 0.5 = -1, (40 + 2) x 0.5 = 21, (30 + 2) x 0.5 = 16.
    Operator *scl = Make(Frame(40, 30), 0.5);
    Ref<Image> shape = Shape(scl);
    ASSERT_NE(shape, nullptr);
    EXPECT_EQ(shape->DataWindow(), ImgRectI(-1, -1, 21, 16));
    // Duplicate edges and Nearest Neighbor do not grow it.
    SetNumber(scl, "Edges", 1);
    EXPECT_EQ(Shape(scl)->DataWindow(), ImgRectI(0, 0, 20, 15));
    SetNumber(scl, "Edges", 0);
    SetNumber(scl, "FilterMethod", 0);
    EXPECT_EQ(Shape(scl)->DataWindow(), ImgRectI(0, 0, 20, 15));
    // Enlarging, the reach is the filter's own radius: Lanczos 3 at 2: (0 - 3) x 2, (40 + 3) x 2.
    SetNumber(scl, "FilterMethod", 8);
    SetNumber(scl, "XSize", 2.0);
    EXPECT_EQ(Shape(scl)->DataWindow(), ImgRectI(-6, -6, 86, 66));
}

TEST_F(ScaleTool, ASizeOfZeroGivesZerosAndAsksForNothing) {
    Ref<Image> src = PatternImage(40, 30);
    src->SetCanvasColor(FltPixel{0.5f, 0.5f, 0.5f, 1.f});
    Operator *scl = Make(src, 0.0, 1.0);
    Ref<Image> out = Render(scl, {.roi = ImgRectI(0, 0, 1, 30)});
    ASSERT_NE(out, nullptr);
    EXPECT_TRUE(out->DataWindow().IsNull());
    EXPECT_TRUE(out->IsCanvasColorClear());
    for (int y = -2; y < 32; y += 3) EXPECT_EQ(out->GetFlt(0, y), FltPixel{});
    ASSERT_EQ(probe->asked.size(), 1u);
    ASSERT_TRUE(probe->asked[0].has_value());
    EXPECT_TRUE(probe->asked[0]->rect.IsNull()); // collapsed on the middle of the region
    // Negative sizes count as not above zero.
    SetNumber(scl, "YSize", -2.0);
    SetNumber(scl, "XSize", 1.0);
    out = Render(scl);
    ASSERT_NE(out, nullptr);
    EXPECT_TRUE(out->DataWindow().IsNull());
}

TEST_F(ScaleTool, PixelsAreTheHostResizersAtTheExactFactors) {
    struct Case {
        double x, y;
        int edges, method, depth;
    };
    const Case cases[] = {{0.5, 0.5, 0, 2, 8},  {1.7, 1.7, 0, 5, 8}, {0.8, 1.3, 1, 8, 8},
                          {0.37, 0.6, 0, 1, 6}, {2.0, 0.5, 1, 0, 5}, {1.0, 1.0, 0, 4, 7}};
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.x << " x " << c.y << " edges " << c.edges << " method " << c.method);
        OrvaneDoc d;
        Ref<Image> src = PatternImage(37, 29, c.depth, 11);
        Operator *scl = AddTool(d, "Scale", AddProbe(d, src));
        SetNumber(scl, "LockXY", 0);
        SetNumber(scl, "XSize", c.x);
        SetNumber(scl, "YSize", c.y);
        SetNumber(scl, "Edges", c.edges);
        SetNumber(scl, "FilterMethod", c.method);
        Ref<Image> out = Render(scl);
        ASSERT_NE(out, nullptr);
        const int edges = c.edges ? EdgeDuplicate : EdgeCanvas;
        Ref<Image> ref = DirectResize(*src, out->Width(), out->Height(), out->DataWindow(),
                                      {{ResizeFilter, c.method + 1},
                                       {ResizeWindow, RszWindowHanning},
                                       {ResizeXScale, c.x},
                                       {ResizeYScale, c.y},
                                       {ResizeXOffset, 0.0},
                                       {ResizeYOffset, 0.0},
                                       {ResizeXEdges, edges},
                                       {ResizeYEdges, edges}});
        ExpectSamePixels(*out, *ref, out->DataWindow().Grown(1, 1));
    }
}

TEST_F(ScaleTool, ARegionOfInterestGivesTheWholeFramesPixels) {
    for (double s : {0.45, 1.0, 2.3}) {
        SCOPED_TRACE(s);
        OrvaneDoc d;
        ProbeSource *p = AddProbe(d, PatternImage(50, 40, 8, 3));
        Operator *scl = AddTool(d, "Scale", p);
        SetNumber(scl, "XSize", s);
        SetNumber(scl, "FilterMethod", 8);
        Ref<Image> whole = Render(scl);
        ASSERT_NE(whole, nullptr);
        const ImgRectI dw = whole->DataWindow();
        for (const ImgRectI roi : {ImgRectI(dw.x0, dw.y0, dw.x0 + 5, dw.y0 + 4), ImgRectI(7, 9, 13, 30),
                                   ImgRectI(dw.x1 - 3, dw.y1 - 8, dw.x1, dw.y1)}) {
            Ref<Image> part = Render(scl, {.roi = roi});
            ASSERT_NE(part, nullptr);
            ExpectSamePixels(*part, *whole, roi);
        }
    }
}

TEST_F(ScaleTool, LockingHidesTheYSizeAndScalesBothAxesByX) {
    Operator *scl = Make(Frame(40, 30), 0.5);
    EXPECT_FALSE(scl->FindInput("YSize")->IsVisible());
    SetNumber(scl, "YSize", 3.0); // ignored while locked
    Ref<Image> shape = Shape(scl);
    ASSERT_NE(shape, nullptr);
    EXPECT_EQ(shape->Height(), 16);
    SetNumber(scl, "LockXY", 0);
    EXPECT_TRUE(scl->FindInput("YSize")->IsVisible());
    EXPECT_EQ(Shape(scl)->Height(), 90);
}

} // namespace
} // namespace Orvane::WarpTest::ScaleT
