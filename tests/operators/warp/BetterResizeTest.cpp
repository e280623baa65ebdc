// Resize: sizes and windows worked out by hand (kept aspect, proxy, field, endless sides), pixels against the
// host's resizer, regions of interest against whole frames, the draft filter, and controls following each other.
#include <array>

#include "tests/operators/warp/WarpTestSupport.h"

#include "host/app/Application.h"
#include "host/flow/AnimCurve.h"

namespace Orvane::WarpTest::ResizeT {
namespace {

class ResizeTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    /// A Resize of `src` to w x h.
    Operator *Make(Ref<Image> src, int w, int h, OrvaneDoc *in = nullptr) {
        OrvaneDoc &d = in ? *in : doc;
        return AddTool(d, "BetterResize", probe = AddProbe(d, std::move(src)), {{"Width", w}, {"Height", h}});
    }
    OrvaneDoc doc;
    ProbeSource *probe = nullptr;
};

TEST_F(ResizeTool, SizesKeptAspectTheHeightControlProxiesAndFields) {
    Operator *rsz = Make(PatternImage(64, 36), 32, 20);
    Ref<Image> out;
    ASSERT_TRUE(Sized(out = Render(rsz), 32, 20));
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 32, 20));
    // Keep Frame Aspect: 32 x 1 / ((64 x 1) / (36 x 1) x 1) + 0.5 = 18.5, cut to 18; the height follows the width.
    SetNumber(rsz, "KeepAspect", 1);
    EXPECT_TRUE(Sized(Render(rsz), 32, 18));
    EXPECT_TRUE(Control(rsz, "Height") == 18.0 && Control(rsz, "Width") == 32.0);
    // At a target pixel aspect of 2:1 the frame needs half the lines: 32 x 2 / (16 / 9) + 0.5 = 36.5.
    SetNumber(rsz, "ChangePixelAspect", 1);
    SetPoint(rsz, "PixelAspect", 2.0, 1.0);
    ASSERT_TRUE(Sized(out = Render(rsz), 32, 36));
    EXPECT_TRUE(out->XScale() == 2.0 && out->YScale() == 1.0);

    // A write-protected document keeps its height control; the frame keeps its aspect all the same.
    OrvaneDoc locked;
    locked.SetWriteProtected(true);
    Operator *fixed = Make(PatternImage(64, 36), 32, 20, &locked);
    SetNumber(fixed, "KeepAspect", 1);
    EXPECT_TRUE(Sized(Render(fixed), 32, 18));
    EXPECT_EQ(Control(fixed, "Height"), 20.0);

    // An animated height gets a key at the rendered time (0).
    OrvaneDoc animated;
    Operator *keyed = Make(PatternImage(64, 36), 32, 20, &animated);
    ASSERT_TRUE(keyed->FindInput("Height")->SetCurve(NumberCurve({{0, 20}, {10, 40}})));
    SetNumber(keyed, "KeepAspect", 1);
    ASSERT_NE(Render(keyed), nullptr);
    const AnimCurve *now = keyed->FindInput("Height")->Curve();
    ASSERT_TRUE(now && now->Keys().size() == 2u);
    auto key = [&](int i) { return dynamic_cast<const Number *>(now->Keys()[i].value.Get())->value; };
    EXPECT_TRUE(key(0) == 18.0 && key(1) == 40.0) << key(0) << " " << key(1);
    // A half-size proxy of a 64 x 36 frame: 41 / 2 and 31 / 2 in whole numbers.
    Ref<Image> proxy = PatternImage(32, 18);
    proxy->SetAttrsTagList({{ImgFullWidth, 64}, {ImgFullHeight, 36}});
    OrvaneDoc proxyDoc;
    ASSERT_TRUE(Sized(out = Render(Make(proxy, 41, 31, &proxyDoc), {.proxy = 2}), 20, 15));
    EXPECT_TRUE(out->GetAttrL(ImgFullWidth) == 41 && out->GetAttrL(ImgFullHeight) == 31);

    // A field of a 64 x 36 frame (18 lines of double height, half a line up) kept at 64 : 36: 18 lines, 9 a field.
    OrvaneDoc fieldDoc;
    Ref<Image> field = PatternImage(64, 18);
    field->SetScale(1.0, 2.0);
    field->SetAttrsTagList({{ImgField, 1}, {ImgFullHeight, 18}, {ImgFieldOffset, 0.5 / 18}});
    Operator *frsz = Make(field, 32, 20, &fieldDoc);
    SetNumber(frsz, "KeepAspect", 1);
    ASSERT_TRUE(Sized(out = Render(frsz), 32, 9));
    EXPECT_TRUE(out->GetAttrL(ImgFullHeight) == 9 && out->GetAttrL(ImgField, -1) == 1);
    EXPECT_DOUBLE_EQ(out->GetAttrD(ImgFieldOffset), 0.5 / 9);
}

TEST_F(ResizeTool, WindowsScaleAndEndlessSidesStay) {
    const ImgRectI dw(-8, 3, 41, 30);
    Operator *rsz = Make(PatternImage(64, 36)->CopyOfImageTagList({{ImgDataWindow, &dw}}), 128, 54);
    Ref<Image> out = Render(rsz);
    ASSERT_NE(out, nullptr);
    // x by 2: -16 .. 82; y by 1.5: 4.5 down to 4, 45 up.
    EXPECT_EQ(out->DataWindow(), ImgRectI(-16, 4, 82, 45));
    // Clipping Mode Frame: the new frame, whatever the source covers; the pixels both windows hold are the same.
    SetID(rsz, "ClippingMode", "ClippingMode_Frame");
    Ref<Image> framed = Render(rsz);
    ASSERT_NE(framed, nullptr);
    EXPECT_EQ(framed->DataWindow(), ImgRectI(0, 0, 128, 54));
    ExpectSamePixels(*framed, *out, ImgRectI(0, 4, 82, 45));

    // Endless sides of a domain pass through the pre-calculation unscaled.
    OrvaneDoc doc2;
    const ImgRectI endless(-E, 3, E, E);
    Ref<Image> open = NewImageTagList({{ImgWidth, 64}, {ImgHeight, 36}, {ImgDataWindow, &endless}});
    Ref<Image> shape = Shape(Make(open, 32, 72, &doc2));
    ASSERT_TRUE(shape && shape->IsNoData());
    EXPECT_EQ(shape->DataWindow(), ImgRectI(-E, 6, E, E));
}

TEST_F(ResizeTool, PixelsAreTheHostResizersForEveryFilterWindowAndRegion) {
    // Filter and window methods, depth, size.
    const std::array<int, 5> cases[] = {{0, 0, 8, 23, 17}, {1, 0, 8, 23, 17}, {2, 0, 8, 61, 45},  {5, 0, 6, 23, 40},
                                        {8, 0, 7, 17, 11}, {9, 3, 8, 55, 12}, {10, 2, 5, 30, 30}, {3, 0, 8, 80, 60},
                                        {6, 0, 8, 13, 7},  {7, 1, 8, 41, 29}, {4, 0, 8, 40, 30}};
    for (const auto &[method, window, depth, w, h] : cases) {
        SCOPED_TRACE(testing::Message() << "method " << method << " window " << window << " depth " << depth);
        OrvaneDoc d;
        Ref<Image> src = PatternImage(40, 30, depth, 7);
        Operator *rsz = Make(src, w, h, &d);
        SetNumbers(rsz, {{"FilterMethod", method}, {"WindowMethod", window}});
        Ref<Image> out = Render(rsz);
        ASSERT_TRUE(out && out->Depth() == depth);
        Ref<Image> ref =
            DirectResize(*src, w, h, out->DataWindow(), {{ResizeFilter, method + 1}, {ResizeWindow, window + 100}});
        ExpectSamePixels(*out, *ref, out->DataWindow().Grown(2, 2));
        // A region of interest gives the whole frame's pixels, and only part of the source is asked for.
        const ImgRectI roi(w / 2, h / 2, w, h);
        ExpectRegionsMatchWhole(rsz, {ImgRectI(0, 0, 3, 2), ImgRectI(1, 2, w / 2, h - 1), roi});
        EXPECT_EQ(Render(rsz, {.roi = roi})->ValidWindow(), roi);
        ASSERT_TRUE(probe->asked.back());
        EXPECT_FALSE(probe->asked.back()->rect.Contains(src->Frame()));
    }
}

TEST_F(ResizeTool, OnlyAQuickRequestWithTheApplicationsSwitchDropsTheFilter) {
    Ref<Image> src = PatternImage(40, 30, 8, 5);
    Operator *rsz = Make(src, 27, 19);
    SetNumbers(rsz, {{"FilterMethod", 5}, {"HiQOnly", 1}});
    const ImgRectI frame(0, 0, 27, 19);
    Ref<Image> nearest = DirectResize(*src, 27, 19, frame, {{ResizeFilter, RszNearest}});
    Ref<Image> filtered = DirectResize(*src, 27, 19, frame, {{ResizeFilter, RszCatmullRom}});

    // The application's switch, a quick request, HiQOnly: the filter is dropped only with all three.
    for (const auto [appSwitch, quick, hiQOnly] : {std::array{1, 1, 1}, {0, 1, 1}, {1, 0, 1}, {1, 1, 0}}) {
        SCOPED_TRACE(testing::Message() << appSwitch << quick << hiQOnly);
        GetApp()->SetAttrsTagList({{AppFastScale, appSwitch}});
        SetNumber(rsz, "HiQOnly", hiQOnly);
        Ref<Image> out = Render(rsz, {.flags = quick ? ReqFlagQuick : 0u});
        ASSERT_NE(out, nullptr);
        ExpectSamePixels(*out, appSwitch && quick && hiQOnly ? *nearest : *filtered, frame);
    }
    GetApp()->SetAttrsTagList({{AppFastScale, 0}});
}

TEST_F(ResizeTool, ControlsFollowOneAnother) {
    Operator *rsz = Make(PatternImage(64, 36), 32, 20);
    Input *window = rsz->FindInput("WindowMethod");
    EXPECT_FALSE(window->IsVisible());
    for (int method : {9, 10, 8}) {
        SetNumber(rsz, "FilterMethod", method);
        EXPECT_EQ(window->IsVisible(), method != 8) << method; // Sinc and Bessel only
    }
    EXPECT_FALSE(rsz->FindInput("PixelAspect")->IsVisible());
    SetNumber(rsz, "ChangePixelAspect", 1);
    EXPECT_TRUE(rsz->FindInput("PixelAspect")->IsVisible());
    SetNumber(rsz, "ChangePixelAspect", 0);

    // Before a render the source is unknown: nothing follows.
    SetNumbers(rsz, {{"KeepAspect", 1}, {"Width", 100}});
    EXPECT_EQ(Control(rsz, "Height"), 20.0);
    ASSERT_NE(Render(rsz), nullptr); // 64 x 36 seen; the height becomes 100 x 36 / 64 + 0.5 = 56.75, cut to 56
    EXPECT_EQ(Control(rsz, "Height"), 56.0);
    SetNumber(rsz, "Width", 128);
    EXPECT_EQ(Control(rsz, "Height"), 72.0);
    SetNumber(rsz, "Height", 45); // 45 x 64 / 36 + 0.5 = 80.5
    EXPECT_EQ(Control(rsz, "Width"), 80.0);
    SetNumbers(rsz, {{"KeepAspect", 0}, {"Width", 10}});
    EXPECT_EQ(Control(rsz, "Height"), 45.0);
    SetNumber(rsz, "ResetSize", 1);
    EXPECT_TRUE(Control(rsz, "Width") == 64.0 && Control(rsz, "Height") == 36.0);

    // The frame format takes over, and Keep Frame Aspect goes.
    doc.SetPref(PREF_FFWidth, 720);
    doc.SetPref(PREF_FFHeight, 576);
    doc.SetPref(PREF_FFAspectX, 1.0667);
    SetNumber(rsz, "UseFrameFormatSettings", 1);
    EXPECT_TRUE(Control(rsz, "Width") == 720.0 && Control(rsz, "Height") == 576.0);
    const auto *aspect = dynamic_cast<const Point *>(rsz->FindInput("PixelAspect")->Constant().Get());
    ASSERT_NE(aspect, nullptr);
    EXPECT_DOUBLE_EQ(aspect->x, 1.0667);
    EXPECT_FALSE(rsz->FindInput("KeepAspect")->IsVisible());
    SetNumber(rsz, "Width", 300); // follows the frame format again
    EXPECT_EQ(Control(rsz, "Width"), 720.0);
}

} // namespace
} // namespace Orvane::WarpTest::ResizeT
