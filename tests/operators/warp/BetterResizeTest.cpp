// Resize: sizes and windows worked out by hand from the rules (kept aspect,
// proxy, field, endless sides, single-precision corners), pixels against the
// host's resizer called directly, regions of interest against whole frames,
// the draft filter, and the controls following one another.
#include "tests/operators/warp/WarpTestSupport.h"

#include "host/app/Application.h"
#include "host/flow/AnimCurve.h"

namespace Orvane::WarpTest::ResizeT {
namespace {

constexpr int E = DomainEndless;

class ResizeTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    /// A Resize of `src` to w x h.
    Operator *Make(Ref<Image> src, int w, int h) {
        probe = AddProbe(doc, std::move(src));
        Operator *rsz = AddTool(doc, "BetterResize", probe);
        SetNumber(rsz, "Width", w);
        SetNumber(rsz, "Height", h);
        return rsz;
    }
    double Control(Operator *op, const char *id) {
        const auto *n = dynamic_cast<const Number *>(op->FindInput(id)->Constant().Get());
        return n ? n->value : -1.0;
    }
    OrvaneDoc doc;
    ProbeSource *probe = nullptr;
};

TEST_F(ResizeTool, SizesKeptAspectAndTheHeightControl) {
    Operator *rsz = Make(PatternImage(64, 36), 32, 20);
    Ref<Image> out = Render(rsz);
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->Width(), 32);
    EXPECT_EQ(out->Height(), 20);
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 32, 20));

    // Keep Frame Aspect: 32 x 1 / ((64 x 1) / (36 x 1) x 1) + 0.5 = 18.5, cut to 18.
    SetNumber(rsz, "KeepAspect", 1);
    out = Render(rsz);
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->Height(), 18);
    EXPECT_EQ(Control(rsz, "Height"), 18.0);
    EXPECT_EQ(Control(rsz, "Width"), 32.0); // the width is what the height follows

    // At a target pixel aspect of 2:1 the frame needs half the lines: 32 x 2 / (16 / 9) + 0.5 = 36.5.
    SetNumber(rsz, "ChangePixelAspect", 1);
    SetPoint(rsz, "PixelAspect", 2.0, 1.0);
    out = Render(rsz);
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->Height(), 36);
    EXPECT_DOUBLE_EQ(out->XScale(), 2.0);
    EXPECT_DOUBLE_EQ(out->YScale(), 1.0);
}

TEST_F(ResizeTool, AWriteProtectedDocumentKeepsItsHeightControl) {
    Operator *rsz = Make(PatternImage(64, 36), 32, 20);
    SetNumber(rsz, "KeepAspect", 1);
    doc.SetWriteProtected(true);
    Ref<Image> out = Render(rsz);
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->Height(), 18); // the frame keeps its aspect all the same
    EXPECT_EQ(Control(rsz, "Height"), 20.0);
}

TEST_F(ResizeTool, AnAnimatedHeightGetsAKeyAtTheRenderedTime) {
    Operator *rsz = Make(PatternImage(64, 36), 32, 20);
    AnimCurve curve;
    curve.SetKey(0.0, MakeRef<Number>(20.0));
    curve.SetKey(10.0, MakeRef<Number>(40.0));
    ASSERT_TRUE(rsz->FindInput("Height")->SetCurve(curve));
    SetNumber(rsz, "KeepAspect", 1);
    ASSERT_NE(Render(rsz), nullptr); // time 0
    const AnimCurve *now = rsz->FindInput("Height")->Curve();
    ASSERT_NE(now, nullptr);
    ASSERT_EQ(now->Keys().size(), 2u);
    EXPECT_EQ(dynamic_cast<const Number *>(now->Keys()[0].value.Get())->value, 18.0);
    EXPECT_EQ(dynamic_cast<const Number *>(now->Keys()[1].value.Get())->value, 40.0);
}

TEST_F(ResizeTool, ProxyAndFieldDivideTheSizeAndTheAttributesKeepTheFullOne) {
    // A half-size proxy of a 64 x 36 frame.
    Ref<Image> proxy = PatternImage(32, 18);
    proxy->SetAttrsTagList({{ImgFullWidth, 64}, {ImgFullHeight, 36}});
    Operator *rsz = Make(proxy, 41, 31);
    Ref<Image> out = Render(rsz, {.proxy = 2});
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->Width(), 20); // 41 / 2, whole numbers
    EXPECT_EQ(out->Height(), 15);
    EXPECT_EQ(out->GetAttrL(ImgFullWidth), 41);
    EXPECT_EQ(out->GetAttrL(ImgFullHeight), 31);

    // One field of a 64 x 36 frame: 18 lines of double height, half a line up.
    OrvaneDoc fieldDoc;
    Ref<Image> field = PatternImage(64, 18);
    field->SetScale(1.0, 2.0);
    field->SetAttrsTagList({{ImgField, 1}, {ImgFullHeight, 18}, {ImgFieldOffset, 0.5 / 18}});
    ProbeSource *src = AddProbe(fieldDoc, field);
    Operator *frsz = AddTool(fieldDoc, "BetterResize", src);
    SetNumber(frsz, "Width", 32);
    SetNumber(frsz, "Height", 20);
    SetNumber(frsz, "KeepAspect", 1); // the frame's aspect: 64 x 1 : 36 x 1, so 18 lines
    out = Render(frsz);
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->Width(), 32);
    EXPECT_EQ(out->Height(), 9);
    EXPECT_EQ(out->GetAttrL(ImgFullHeight), 9);
    EXPECT_DOUBLE_EQ(out->GetAttrD(ImgFieldOffset), 0.5 / 9);
    EXPECT_EQ(out->GetAttrL(ImgField, -1), 1);
}

TEST_F(ResizeTool, WindowsScaleAndEndlessSidesStay) {
    Ref<Image> src = PatternImage(64, 36);
    const ImgRectI dw(-8, 3, 41, 30);
    Ref<Image> shifted = src->CopyOfImageTagList({{ImgDataWindow, &dw}});
    Operator *rsz = Make(shifted, 128, 54);
    Ref<Image> out = Render(rsz);
    ASSERT_NE(out, nullptr);
    // x by 2: -16 .. 82; y by 1.5: 4.5 down to 4, 45 up.
    EXPECT_EQ(out->DataWindow(), ImgRectI(-16, 4, 82, 45));
    // Clipping Mode Frame: the new frame, whatever the source covers; the
    // pixels both windows hold are the same.
    SetID(rsz, "ClippingMode", "ClippingMode_Frame");
    Ref<Image> framed = Render(rsz);
    ASSERT_NE(framed, nullptr);
    EXPECT_EQ(framed->DataWindow(), ImgRectI(0, 0, 128, 54));
    ExpectSamePixels(*framed, *out, ImgRectI(0, 4, 82, 45));

    // Endless sides of a domain pass through the pre-calculation unscaled.
    OrvaneDoc doc2;
    const ImgRectI endless(-E, 3, E, E);
    Ref<Image> open = NewImageTagList({{ImgWidth, 64}, {ImgHeight, 36}, {ImgDataWindow, &endless}});
    Operator *rsz2 = AddTool(doc2, "BetterResize", AddProbe(doc2, open));
    SetNumber(rsz2, "Width", 32);
    SetNumber(rsz2, "Height", 72);
    Ref<Image> shape = Shape(rsz2);
    ASSERT_NE(shape, nullptr);
    EXPECT_TRUE(shape->IsNoData());
    EXPECT_EQ(shape->DataWindow(), ImgRectI(-E, 6, E, E));

    // Corners in single precision: 7 -> 1 takes 21 x (1/7) = 3.0000002 up to 4.
    OrvaneDoc doc3;
    const ImgRectI wide(0, 0, 21, 21);
    Ref<Image> seven = NewImageTagList({{ImgWidth, 7}, {ImgHeight, 7}, {ImgDataWindow, &wide}});
    Operator *rsz3 = AddTool(doc3, "BetterResize", AddProbe(doc3, seven));
    SetNumber(rsz3, "Width", 1);
    SetNumber(rsz3, "Height", 1);
    shape = Shape(rsz3);
    ASSERT_NE(shape, nullptr);
    EXPECT_EQ(shape->DataWindow(), ImgRectI(0, 0, 4, 4));
}

TEST_F(ResizeTool, PixelsAreTheHostResizersForEveryFilterAndWindow) {
    struct Case {
        int method, window, depth, w, h;
    };
    const Case cases[] = {{0, 0, 8, 23, 17}, {1, 0, 8, 23, 17}, {2, 0, 8, 61, 45},  {5, 0, 6, 23, 40},
                          {8, 0, 7, 17, 11}, {9, 3, 8, 55, 12}, {10, 2, 5, 30, 30}, {3, 0, 8, 80, 60},
                          {6, 0, 8, 13, 7},  {7, 1, 8, 41, 29}, {4, 0, 8, 40, 30}};
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << "method " << c.method << " window " << c.window << " depth " << c.depth);
        OrvaneDoc d;
        Ref<Image> src = PatternImage(40, 30, c.depth, 7);
        Operator *rsz = AddTool(d, "BetterResize", AddProbe(d, src));
        SetNumber(rsz, "Width", c.w);
        SetNumber(rsz, "Height", c.h);
        SetNumber(rsz, "FilterMethod", c.method);
        SetNumber(rsz, "WindowMethod", c.window);
        Ref<Image> out = Render(rsz);
        ASSERT_NE(out, nullptr);
        EXPECT_EQ(out->Depth(), c.depth);
        Ref<Image> ref = DirectResize(*src, c.w, c.h, out->DataWindow(),
                                      {{ResizeFilter, c.method + 1}, {ResizeWindow, c.window + 100}});
        ExpectSamePixels(*out, *ref, out->DataWindow().Grown(2, 2));
    }
}

TEST_F(ResizeTool, ARegionOfInterestGivesTheWholeFramesPixels) {
    for (int method : {1, 2, 5, 8, 9}) {
        SCOPED_TRACE(method);
        OrvaneDoc d;
        Ref<Image> src = PatternImage(50, 40, 8, 3);
        ProbeSource *p = AddProbe(d, src);
        Operator *rsz = AddTool(d, "BetterResize", p);
        SetNumber(rsz, "Width", 31);
        SetNumber(rsz, "Height", 67);
        SetNumber(rsz, "FilterMethod", method);
        Ref<Image> whole = Render(rsz);
        ASSERT_NE(whole, nullptr);
        for (const ImgRectI roi : {ImgRectI(3, 5, 11, 20), ImgRectI(20, 50, 31, 67), ImgRectI(0, 0, 2, 3)}) {
            p->asked.clear();
            Ref<Image> part = Render(rsz, {.roi = roi});
            ASSERT_NE(part, nullptr);
            EXPECT_EQ(part->ValidWindow(), roi);
            ExpectSamePixels(*part, *whole, roi);
            // Only part of the source was asked for.
            ASSERT_EQ(p->asked.size(), 1u);
            ASSERT_TRUE(p->asked[0].has_value());
            EXPECT_FALSE(p->asked[0]->rect.Contains(src->Frame()));
        }
    }
}

TEST_F(ResizeTool, OnlyAQuickRequestWithTheApplicationsSwitchDropsTheFilter) {
    Ref<Image> src = PatternImage(40, 30, 8, 5);
    Operator *rsz = Make(src, 27, 19);
    SetNumber(rsz, "FilterMethod", 5);
    SetNumber(rsz, "HiQOnly", 1);
    const ImgRectI frame(0, 0, 27, 19);
    Ref<Image> nearest = DirectResize(*src, 27, 19, frame, {{ResizeFilter, RszNearest}});
    Ref<Image> filtered = DirectResize(*src, 27, 19, frame, {{ResizeFilter, RszCatmullRom}});

    struct Case {
        bool appSwitch, quick, hiQOnly, dropped;
    };
    for (const Case c : {Case{true, true, true, true}, Case{false, true, true, false}, Case{true, false, true, false},
                         Case{true, true, false, false}}) {
        SCOPED_TRACE(testing::Message() << c.appSwitch << c.quick << c.hiQOnly);
        GetApp()->SetAttrsTagList({{AppFastScale, c.appSwitch ? 1 : 0}});
        SetNumber(rsz, "HiQOnly", c.hiQOnly ? 1 : 0);
        Ref<Image> out = Render(rsz, {.flags = c.quick ? ReqFlagQuick : 0u});
        ASSERT_NE(out, nullptr);
        ExpectSamePixels(*out, c.dropped ? *nearest : *filtered, frame);
    }
    GetApp()->SetAttrsTagList({{AppFastScale, 0}});
}

TEST_F(ResizeTool, ControlsFollowOneAnother) {
    Operator *rsz = Make(PatternImage(64, 36), 32, 20);
    Input *window = rsz->FindInput("WindowMethod");
    EXPECT_FALSE(window->IsVisible());
    SetNumber(rsz, "FilterMethod", 9);
    EXPECT_TRUE(window->IsVisible());
    SetNumber(rsz, "FilterMethod", 10);
    EXPECT_TRUE(window->IsVisible());
    SetNumber(rsz, "FilterMethod", 8);
    EXPECT_FALSE(window->IsVisible());
    EXPECT_FALSE(rsz->FindInput("PixelAspect")->IsVisible());
    SetNumber(rsz, "ChangePixelAspect", 1);
    EXPECT_TRUE(rsz->FindInput("PixelAspect")->IsVisible());
    SetNumber(rsz, "ChangePixelAspect", 0);

    // Before a render the source is unknown: nothing follows.
    SetNumber(rsz, "KeepAspect", 1);
    SetNumber(rsz, "Width", 100);
    EXPECT_EQ(Control(rsz, "Height"), 20.0);
    ASSERT_NE(Render(rsz), nullptr); // 64 x 36 seen; the height becomes 100 x 36 / 64 + 0.5 = 56.75, cut to 56
    EXPECT_EQ(Control(rsz, "Height"), 56.0);
    SetNumber(rsz, "Width", 128);
    EXPECT_EQ(Control(rsz, "Height"), 72.0);
    SetNumber(rsz, "Height", 45); // 45 x 64 / 36 + 0.5 = 80.5
    EXPECT_EQ(Control(rsz, "Width"), 80.0);
    SetNumber(rsz, "KeepAspect", 0);
    SetNumber(rsz, "Width", 10);
    EXPECT_EQ(Control(rsz, "Height"), 45.0);
    SetNumber(rsz, "ResetSize", 1);
    EXPECT_EQ(Control(rsz, "Width"), 64.0);
    EXPECT_EQ(Control(rsz, "Height"), 36.0);

    // The frame format takes over, and Keep Frame Aspect goes.
    doc.SetPref(PREF_FFWidth, 720);
    doc.SetPref(PREF_FFHeight, 576);
    doc.SetPref(PREF_FFAspectX, 1.0667);
    SetNumber(rsz, "UseFrameFormatSettings", 1);
    EXPECT_EQ(Control(rsz, "Width"), 720.0);
    EXPECT_EQ(Control(rsz, "Height"), 576.0);
    const auto *aspect = dynamic_cast<const Point *>(rsz->FindInput("PixelAspect")->Constant().Get());
    ASSERT_NE(aspect, nullptr);
    EXPECT_DOUBLE_EQ(aspect->x, 1.0667);
    EXPECT_FALSE(rsz->FindInput("KeepAspect")->IsVisible());
    SetNumber(rsz, "Width", 300); // follows the frame format again
    EXPECT_EQ(Control(rsz, "Width"), 720.0);
}

} // namespace
} // namespace Orvane::WarpTest::ResizeT
