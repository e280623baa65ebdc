// Set Canvas Color: pixels stay byte for byte, everything beyond the input's data window takes the new colour under
// every clipping mode and depth, regions are crops of the whole render, the old class ID still makes the tool.
#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

using SetCanvasColor = ColorTool;

TEST_F(SetCanvasColor, PixelsStayAndTheRestTakesTheColourUnderEveryClippingMode) {
    const ImgRectI inWindow(8, 4, 40, 28), roi(30, 20, 60, 40);
    const FltPixel color{0.25f, -0.5f, 1.5f, 1.f};
    for (int depth : kEveryDepth)
        for (const auto &[mode, window] : {std::pair{"ClippingMode_None", inWindow},
                                           {"ClippingMode_Domain", inWindow},
                                           {"ClippingMode_Frame", ImgRectI(0, 0, 48, 32)}}) {
            SCOPED_TRACE(std::string(mode) + " depth " + std::to_string(depth));
            Ref<Image> src = Orvane::Test::WindowedImage(48, 32, inWindow, {0.2f, 0.4f, 0.6f, 0.8f}, 4, depth);
            Rig rig("SetCanvasColor", src);
            Orvane::Test::SetNumbers(
                rig.tool,
                {{"CanvasRed", color.R}, {"CanvasGreen", color.G}, {"CanvasBlue", color.B}, {"CanvasAlpha", 1}});
            Orvane::Test::SetID(rig.tool, "ClippingMode", mode);
            Ref<Image> shape = Render(rig.tool, nullptr, ReqFlagPreCalc), out = Render(rig.tool),
                       part = Render(rig.tool, &roi);
            ASSERT_TRUE(shape && shape->IsNoData() && shape->DataWindow() == window && out &&
                        out->DataWindow() == window && part && part->DataWindow() == (window & roi));
            EXPECT_TRUE(shape->GetCanvasColor() == color && out->GetCanvasColor() == color);
            ExpectSameBits(*out, *src, inWindow);
            ExpectSameBits(*part, *out, window & roi);
            for (int y = window.y0; y < window.y1; ++y)
                for (int x = window.x0; x < window.x1; ++x)
                    if (!inWindow.Contains(x, y)) ExpectPx(depth, PxAt(*out, x, y), ToPx(color), 0, "added");
        }
}

TEST_F(SetCanvasColor, TheSameColourHandsTheInputOnAndTheOldIdMakesTheTool) {
    Ref<Image> src = Orvane::Test::WindowedImage(16, 8, ImgRectI(2, 2, 10, 6), {}, 1);
    Rig rig("SetCanvasColor", src);
    EXPECT_EQ(Render(rig.tool).Get(), src.Get()); // the default colour is the input's canvas
    EXPECT_EQ(rig.doc.AddTool(OvID("SetBgColor"))->ClassID(), OvID("SetCanvasColor"));
}

} // namespace
} // namespace Orvane::colortest
