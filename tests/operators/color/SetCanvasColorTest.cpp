#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using SetCanvasColor = ColorTool;

TEST_F(SetCanvasColor, PixelsStayTheRestTakesTheColourTheSameColourHandsOnAndTheOldIdMakesTheTool) {
    const Setter set = Numbers({{"CanvasRed", .25}, {"CanvasGreen", -.5}, {"CanvasBlue", 1.5}, {"CanvasAlpha", 1}});
    const auto model = [](const Px &p) { return p == ToPx(kFrameCanvas) ? Px{.25, -.5, 1.5, 1} : p; };
    ExpectFrame("SetCanvasColor", {{set, model}}, 0, kEveryDepth, true);
    Ref<Image> src = WindowedImage(16, 8, ImgRectI(2, 2, 10, 6), {}, 1);
    EXPECT_EQ(Through(src, {{"SetCanvasColor", Numbers({})}}).Get(), src.Get()); // the default colour is the input's
    EXPECT_EQ(OrvaneDoc().AddTool(OvID("SetBgColor"))->ClassID(), OvID("SetCanvasColor"));
}

} // namespace Orvane::colortest
