// Set Canvas Color: the pixels stay byte for byte, everything beyond the input's data window (and the canvas) takes
// the new colour under every clipping mode and depth, regions are crops of the whole render, and the old class ID
// still makes the tool.
#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class SetCanvasColor : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

void SetColor(Operator *op, const FltPixel &c) {
    Orvane::Test::SetNumbers(op, {{"CanvasRed", c.R}, {"CanvasGreen", c.G}, {"CanvasBlue", c.B}, {"CanvasAlpha", c.A}});
}

TEST_F(SetCanvasColor, PixelsStayAndTheRestTakesTheColourUnderEveryClippingMode) {
    const ImgRectI inWindow(8, 4, 40, 28);
    const FltPixel oldCanvas{0.2f, 0.4f, 0.6f, 0.8f}, color{0.25f, -0.5f, 1.5f, 1.f};
    const std::pair<const char *, ImgRectI> clips[] = {{"ClippingMode_None", inWindow},
                                                       {"ClippingMode_Domain", inWindow},
                                                       {"ClippingMode_Frame", ImgRectI(0, 0, 48, 32)}};
    for (int depth : kEveryDepth)
        for (const auto &[mode, window] : clips) {
            SCOPED_TRACE(std::string(mode) + " depth " + std::to_string(depth));
            Ref<Image> src = Orvane::Test::WindowedImage(48, 32, inWindow, oldCanvas, 4, depth);
            Rig rig("SetCanvasColor", src);
            SetColor(rig.tool, color);
            Orvane::Test::SetID(rig.tool, "ClippingMode", mode);
            Ref<Image> shape = Render(rig.tool, nullptr, ReqFlagPreCalc);
            ASSERT_TRUE(shape && shape->IsNoData() && shape->DataWindow() == window);
            EXPECT_EQ(shape->GetCanvasColor(), color);
            Ref<Image> out = Render(rig.tool);
            ASSERT_TRUE(out && out->DataWindow() == window && out->Depth() == depth);
            EXPECT_EQ(out->GetCanvasColor(), color);
            ExpectSameBits(*out, *src, inWindow);
            // The widened part: the colour as the depth stores it.
            for (int y = window.y0; y < window.y1; ++y)
                for (int x = window.x0; x < window.x1; ++x) {
                    if (inWindow.Contains(x, y)) continue;
                    const Px want = ToPx(color);
                    for (int c = 0; c < 4; ++c) {
                        const double w = Storable(depth, want[c]);
                        ASSERT_NEAR(Unit(*out, x, y, c), w, StoredTolerance(depth, w)) << x << "," << y;
                    }
                }
            for (const ImgRectI &roi : {ImgRectI(2, 1, 20, 12), ImgRectI(30, 20, 60, 40)}) {
                Ref<Image> part = Render(rig.tool, &roi);
                ASSERT_TRUE(part && part->DataWindow() == (window & roi));
                EXPECT_EQ(part->GetCanvasColor(), color);
                ExpectSameBits(*part, *out, window & roi);
            }
        }
}

TEST_F(SetCanvasColor, TheSameColourHandsTheInputOnAndTheOldIdMakesTheTool) {
    const FltPixel canvas{0.f, 0.f, 0.f, 0.f};
    Ref<Image> src = Orvane::Test::WindowedImage(16, 8, ImgRectI(2, 2, 10, 6), canvas, 1);
    Rig rig("SetCanvasColor", src);
    EXPECT_EQ(Render(rig.tool).Get(), src.Get()); // the default colour is the input's canvas
    SetColor(rig.tool, {0.f, 0.f, 0.f, 1.f});
    Ref<Image> out = Render(rig.tool);
    ASSERT_TRUE(out && out.Get() != src.Get());
    EXPECT_EQ(out->GetCanvasColor(), (FltPixel{0.f, 0.f, 0.f, 1.f}));
    Operator *old = rig.doc.AddTool(OvID("SetBgColor"));
    ASSERT_NE(old, nullptr);
    EXPECT_EQ(old->ClassID(), OvID("SetCanvasColor"));
}

} // namespace
} // namespace Orvane::colortest
