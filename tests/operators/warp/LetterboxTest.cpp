// Letterbox: both modes with sizes, offsets and clamped pans worked out by hand, pixels against the host's
// resizer with the same placement, clipping modes and canvas, proxies, frame format, regions of interest.
#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest::LetterboxT {
namespace {

class LetterboxTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    Operator *Make(Ref<Image> src, int mode = 0, OrvaneDoc *in = nullptr) {
        OrvaneDoc &d = in ? *in : doc;
        return AddTool(d, "Letterbox", AddProbe(d, std::move(src)), {{"Width", 100}, {"Height", 100}, {"Mode", mode}});
    }
    OrvaneDoc doc;
};

/// The host's resizer with a placement, Linear filter, reading `read`.
Ref<Image> Reference(const Image &src, const ImgRectI &window, const Placement &p, const ImgRectI &read) {
    return PlacedResize(src, 100, 100, window, RszLinear, p, &read);
}

TEST_F(LetterboxTool, ModesPlaceAndPanTheFrameAsWorkedOutByHandForEveryRegion) {
    constexpr int D = EdgeDuplicate, C = EdgeCanvas;
    struct Case {
        const char *what;
        int w, h, mode;
        double cx, cy, aspectX;
        ImgRectI window;
        Placement p;
    };
    const Case cases[] = {
        // 200 x 100 into 100 x 100: sh = 100 x (100 x 1 / 1) / (200 x 1) = 50, placed 25 up.
        {"wide between bars", 200, 100, 0, 0.5, 0.5, 1.0, {0, 25, 100, 75}, {0.5, 0.5, 0, 25, D, C}},
        {"no excess: no pan", 200, 100, 0, 0.2, 0.9, 1.0, {0, 25, 100, 75}, {0.5, 0.5, 0, 25, D, C}},
        // 100 x 200: sh = 200, excess 50 on each side; oy = clamp((0.5 - cy) x 200, -50, 50)
        // and the source's origin lands at (100 - 200) / 2 + oy.
        {"tall, centred", 100, 200, 0, 0.5, 0.5, 1.0, {0, -50, 100, 150}, {1, 1, 0, -50, D, C}},
        {"tall, panned", 100, 200, 0, 0.5, 0.6, 1.0, {0, -70, 100, 130}, {1, 1, 0, -70, D, C}},
        {"tall, pan clamped low", 100, 200, 0, 0.5, 1.0, 1.0, {0, -100, 100, 100}, {1, 1, 0, -100, D, C}},
        {"tall, pan clamped high", 100, 200, 0, 0.5, -3.0, 1.0, {0, 0, 100, 200}, {1, 1, 0, 0, D, C}},
        // Pan and scan: sw = 200 x (100 x 1 / 1) / (100 x 1) = 200, e = 50.
        {"pan and scan", 200, 100, 1, 0.5, 0.5, 1.0, {-50, 0, 150, 100}, {1, 1, -50, 0, C, D}},
        // Center X 0.1: (0.5 - 0.1) x 200 = 80, clamped to 50: the left edge shows.
        {"pan and scan, clamped", 200, 100, 1, 0.1, 0.5, 1.0, {0, 0, 200, 100}, {1, 1, 0, 0, C, D}},
        // At 0.5 : 1 the frame needs sh = 100 x (100 x 0.5) / 200 = 25 lines: 37.5 .. 62.5 outward.
        {"output pixel aspect", 200, 100, 0, 0.5, 0.5, 0.5, {0, 37, 100, 63}, {0.5, 0.25, 0, 37.5, D, C}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        OrvaneDoc d;
        Ref<Image> src = PatternImage(c.w, c.h, 8, c.w + c.h);
        Operator *lbx = Make(src, c.mode, &d);
        SetPoint(lbx, "Center", c.cx, c.cy);
        SetPoint(lbx, "PixelAspect", c.aspectX, 1.0);
        Ref<Image> out = Render(lbx);
        ASSERT_TRUE(Sized(out, 100, 100));
        EXPECT_DOUBLE_EQ(out->XScale(), c.aspectX);
        EXPECT_TRUE(out->IsCanvasColorClear());
        EXPECT_EQ(out->DataWindow(), c.window);
        Ref<Image> ref = Reference(*src, out->DataWindow(), c.p, src->Frame());
        ExpectSamePixels(*out, *ref, ImgRectI(-2, -2, 102, 102));
        // The legacy pair is kept for documents but read by nothing.
        SetNumber(lbx, "AspectX", 3.0);
        EXPECT_EQ(Render(lbx)->DataWindow(), c.window);
        // Regions of interest give the whole frame's pixels, with the widest filter too.
        SetNumber(lbx, "FilterMethod", 8);
        ExpectRegionsMatchWhole(lbx, {ImgRectI(0, 0, 9, 48), ImgRectI(30, 20, 40, 30), ImgRectI(60, 90, 100, 100)});
    }
}

TEST_F(LetterboxTool, FramingMakesACanvasRealAndClearsWhatLiesBeyond) {
    Ref<Image> full = PatternImage(200, 100, 8, 5);
    const ImgRectI dw(20, 10, 180, 90);
    const FltPixel red{1.f, 0.f, 0.f, 1.f};
    Ref<Image> src = full->CopyOfImageTagList({{ImgDataWindow, &dw}, {ImgCanvasColor, &red}});
    Operator *lbx = Make(src);
    Ref<Image> out = Render(lbx);
    ASSERT_TRUE(out && out->IsCanvasColorClear());
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 25, 100, 75)); // the whole frame, red where the source had canvas
    // Made by hand: the frame with red outside the window, clear beyond.
    const ImgRectI frame = src->Frame();
    Ref<Image> real = FlatImage(200, 100, DepthRGBAFlt32, red);
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) real->PutFlt(x, y, full->GetFlt(x, y));
    const Placement p{0.5, 0.5, 0.0, 25.0, EdgeDuplicate, EdgeCanvas};
    ExpectSamePixels(*out, *Reference(*real, out->DataWindow(), p, frame), ImgRectI(-2, -2, 102, 102));

    // Without clipping the canvas stays the source's; the tool takes whole frames, so it gets the source made real.
    SetID(lbx, "ClippingMode", "ClippingMode_None");
    ASSERT_TRUE(out = Render(lbx));
    EXPECT_EQ(out->GetCanvasColor(), red);
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 25, 100, 75));
    real->SetCanvasColor(red);
    const ImgRectI all(-E, -E, E, E);
    ExpectSamePixels(*out, *Reference(*real, out->DataWindow(), p, all), out->DataWindow());
}

TEST_F(LetterboxTool, ProxyFieldsAndTheFrameFormat) {
    // A half-size proxy of 200 x 100 into 100 x 100 at proxy 2: 50 x 50, sh = 25.
    Ref<Image> src = PatternImage(100, 50, 8, 6);
    src->SetAttrsTagList({{ImgFullWidth, 200}, {ImgFullHeight, 100}});
    Operator *lbx = Make(src);
    Ref<Image> out = Render(lbx, {.proxy = 2});
    ASSERT_TRUE(Sized(out, 50, 50));
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 12, 50, 38)); // 12.5 .. 37.5 outward
    EXPECT_TRUE(out->GetAttrL(ImgFullWidth) == 100 && out->GetAttrL(ImgFullHeight) == 100);

    // A field of a 200 x 100 frame (50 lines of double height) into 100 x 100:
    // 50 lines, pixel aspect Y doubled; sh = 50 x 2 x (100 x 1 / 2) / 200 = 25.
    OrvaneDoc d;
    Ref<Image> field = PatternImage(200, 50, 8, 7);
    field->SetScale(1.0, 2.0);
    field->SetAttrsTagList({{ImgField, 0}});
    ASSERT_TRUE(Sized(out = Render(Make(field, 0, &d)), 100, 50));
    EXPECT_DOUBLE_EQ(out->YScale(), 2.0);
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 12, 100, 38));

    // The frame format takes over the size.
    doc.SetPref(PREF_FFWidth, 160);
    doc.SetPref(PREF_FFHeight, 90);
    SetNumber(lbx, "UseFrameFormatSettings", 1);
    EXPECT_EQ(Control(lbx, "Width"), 160.0);
    EXPECT_TRUE(Sized(Render(lbx), 160, 90));
}

} // namespace
} // namespace Orvane::WarpTest::LetterboxT
