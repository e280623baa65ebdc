#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using SetCanvasColor = ColorTool;

TEST_F(SetCanvasColor, PixelsStayTheRestTakesTheColourTheSameColourHandsOnAndTheOldIdMakesTheTool) {
    const ImgRectI inWindow(8, 4, 40, 28), roi(30, 20, 60, 40);
    const FltPixel color{0.25f, -0.5f, 1.5f, 1.f};
    for (int depth : kEveryDepth)
        for (const char *mode : {"ClippingMode_None", "ClippingMode_Domain", "ClippingMode_Frame"}) {
            SCOPED_TRACE(std::string(mode) + " depth " + std::to_string(depth));
            const ImgRectI window = std::string(mode) == "ClippingMode_Frame" ? ImgRectI(0, 0, 48, 32) : inWindow;
            Ref<Image> src = Orvane::Test::WindowedImage(48, 32, inWindow, {0.2f, 0.4f, 0.6f, 0.8f}, 4, depth);
            Rig rig("SetCanvasColor", src);
            Numbers({{"CanvasRed", color.R}, {"CanvasGreen", color.G}, {"CanvasBlue", color.B}, {"CanvasAlpha", 1}})(
                rig.tool);
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
    Ref<Image> src = Orvane::Test::WindowedImage(16, 8, ImgRectI(2, 2, 10, 6), {}, 1);
    Rig rig("SetCanvasColor", src);
    EXPECT_EQ(Render(rig.tool).Get(), src.Get()); // the default colour is the input's canvas
    EXPECT_EQ(rig.doc.AddTool(OvID("SetBgColor"))->ClassID(), OvID("SetCanvasColor"));
}

} // namespace Orvane::colortest
