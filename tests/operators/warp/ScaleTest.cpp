// Scale: the parity rule, fields, proxies, the window's reach and the lock worked out by hand, a size of zero,
// pixels against the host's resizer, and regions of interest against whole frames.
#include <tuple>

#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest::ScaleT {
namespace {

class ScaleTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
};

TEST_F(ScaleTool, TheSizeKeepsItsParity) {
    // x = w / 2 x s; odd w: ceil(x - 1/2) + 1/2, even w: ceil(x); side = truncate(2x + 1/2).
    const std::tuple<int, double, int> cases[] = {{5, 1.0, 5},      {5, 0.5, 3},      {6, 0.5, 4},  {7, 0.5, 5},
                                                  {4, 1.3, 6},      {9, 2.0, 19},     {8, 0.25, 2}, {1, 0.1, 1},
                                                  {1920, 0.5, 960}, {1921, 0.5, 961}, {3, 3.0, 9},  {2, 0.01, 2}};
    for (const auto &[w, s, expected] : cases) {
        OrvaneDoc d;
        Ref<Image> shape =
            Shape(AddTool(d, "Scale", AddProbe(d, NewImageTagList({{ImgWidth, w}, {ImgHeight, 10}})), {{"XSize", s}}));
        EXPECT_EQ(shape ? shape->Width() : -1, expected) << w << " at " << s;
    }
}

TEST_F(ScaleTool, FieldsProxiesReachLockAndZeroWorkedOutByHand) {
    struct Case {
        const char *what;
        Ref<Image> src;
        std::vector<std::pair<const char *, double>> controls;
        int proxy, w, h;
        ImgRectI window; ///< checked when not empty
    };
    // A field of a 40 x 30 frame: 30 at 0.5 gives 7.5, up to 8: 16 lines, 8 per field. A half-size proxy of a 45 x 30
    // frame at 1.2: 45 x 0.6 = 27 (odd), ceil(26.5) + 0.5 = 27.5 -> 55; 30 x 0.6 = 18 -> 36; halved: 27 x 18.
    const Ref<Image> frame = NewImageTagList({{ImgWidth, 40}, {ImgHeight, 30}});
    const Ref<Image> field = NewImageTagList({{ImgWidth, 40}, {ImgHeight, 15}, {ImgYScale, 2.0}, {ImgField, 0}});
    const Ref<Image> proxy =
        NewImageTagList({{ImgWidth, 22}, {ImgHeight, 15}, {ImgFullWidth, 45}, {ImgFullHeight, 30}});
    const Case cases[] = {
        {"field", field, {{"XSize", 0.5}}, 1, 20, 8, {}},
        {"proxy", proxy, {{"XSize", 1.2}}, 2, 27, 18, {}},
        // Linear (radius 1) at 0.5 reaches 2 source pixels: (0 - 2) x 0.5 = -1, (40 + 2) x 0.5 = 21.
        {"linear reach", frame, {{"XSize", 0.5}}, 1, 20, 16, {-1, -1, 21, 16}},
        {"duplicated edges do not grow it", frame, {{"XSize", 0.5}, {"Edges", 1}}, 1, 20, 16, {0, 0, 20, 15}},
        {"nor does the nearest pixel", frame, {{"XSize", 0.5}, {"FilterMethod", 0}}, 1, 20, 16, {0, 0, 20, 15}},
        // Enlarging, the reach is the filter's own radius: Lanczos 3 at 2: (0 - 3) x 2, (40 + 3) x 2.
        {"lanczos enlarging", frame, {{"XSize", 2.0}, {"FilterMethod", 8}}, 1, 80, 60, {-6, -6, 86, 66}},
        {"locked: Y Size ignored", frame, {{"XSize", 0.5}, {"YSize", 3.0}}, 1, 20, 16, {}},
        {"unlocked", frame, {{"XSize", 0.5}, {"YSize", 3.0}, {"LockXY", 0}}, 1, 20, 90, {}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        OrvaneDoc d;
        Operator *scl = AddTool(d, "Scale", AddProbe(d, c.src), c.controls);
        EXPECT_EQ(scl->FindInput("YSize")->IsVisible(), Control(scl, "LockXY") == 0.0);
        Ref<Image> shape = Shape(scl, {.proxy = c.proxy});
        ASSERT_TRUE(Sized(shape, c.w, c.h));
        EXPECT_TRUE(c.window.IsNull() || shape->DataWindow() == c.window);
        if (c.proxy > 1) {
            EXPECT_TRUE(shape->GetAttrL(ImgFullWidth) == 55 && shape->GetAttrL(ImgFullHeight) == 36);
        }
    }
    // A size of zero gives zeros and asks for nothing.
    OrvaneDoc doc;
    Ref<Image> src = PatternImage(40, 30);
    src->SetCanvasColor(FltPixel{0.5f, 0.5f, 0.5f, 1.f});
    ProbeSource *probe = AddProbe(doc, src);
    Operator *scl = AddTool(doc, "Scale", probe, {{"LockXY", 0}, {"XSize", 0.0}, {"YSize", 1.0}});
    Ref<Image> out = Render(scl, {.roi = ImgRectI(0, 0, 1, 30)});
    ASSERT_TRUE(out && out->DataWindow().IsNull() && out->IsCanvasColorClear());
    for (int y = -2; y < 32; y += 3) EXPECT_EQ(out->GetFlt(0, y), FltPixel{});
    ASSERT_TRUE(probe->asked.size() == 1 && probe->asked[0]);
    EXPECT_TRUE(probe->asked[0]->rect.IsNull()); // collapsed on the middle of the region
    // Negative sizes count as not above zero.
    SetNumbers(scl, {{"YSize", -2.0}, {"XSize", 1.0}});
    ASSERT_TRUE(out = Render(scl));
    EXPECT_TRUE(out->DataWindow().IsNull());
}

TEST_F(ScaleTool, PixelsAreTheHostResizersAtTheExactFactorsForEveryRegion) {
    // x and y factors, Duplicate edges (or Canvas), filter method, depth.
    const std::tuple<double, double, bool, int, int> cases[] = {{0.5, 0.5, false, 2, 8}, {1.7, 1.7, false, 5, 8},
                                                                {0.8, 1.3, true, 8, 8},  {0.37, 0.6, false, 1, 6},
                                                                {2.0, 0.5, true, 0, 5},  {1.0, 1.0, false, 4, 7}};
    for (const auto &[x, y, duplicate, method, depth] : cases) {
        SCOPED_TRACE(testing::Message() << x << " x " << y << " edges " << duplicate << " method " << method);
        OrvaneDoc d;
        Ref<Image> src = PatternImage(37, 29, depth, 11);
        Operator *scl =
            AddTool(d, "Scale", AddProbe(d, src),
                    {{"LockXY", 0}, {"XSize", x}, {"YSize", y}, {"Edges", duplicate}, {"FilterMethod", method}});
        Ref<Image> out = Render(scl);
        ASSERT_NE(out, nullptr);
        const int edges = duplicate ? EdgeDuplicate : EdgeCanvas;
        Ref<Image> ref = PlacedResize(*src, out->Width(), out->Height(), out->DataWindow(), method + 1,
                                      {x, y, 0.0, 0.0, edges, edges});
        ExpectSamePixels(*out, *ref, out->DataWindow().Grown(1, 1));
        // Regions of interest give the whole frame's pixels, at duplicated edges too (the filter reads past the
        // region there although the window does not grow).
        const ImgRectI dw = out->DataWindow();
        ExpectRegionsMatchWhole(scl, {ImgRectI(dw.x0, dw.y0, dw.x0 + 5, dw.y0 + 4), ImgRectI(7, 9, 13, 30),
                                      ImgRectI(dw.x1 - 3, dw.y1 - 8, dw.x1, dw.y1)});
    }
}

} // namespace
} // namespace Orvane::WarpTest::ScaleT
