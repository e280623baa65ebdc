#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using SetCanvasColor = ColorTool;
TEST_F(SetCanvasColor, PixelsStayTheRestTakesTheColourTheSameColourHandsOnAndTheOldIdMakesTheTool) {
    const Px color{0.25, -0.5, 1.5, 1};
    ExpectFrame(
        "SetCanvasColor",
        {{Numbers({{"CanvasRed", color[0]}, {"CanvasGreen", color[1]}, {"CanvasBlue", color[2]}, {"CanvasAlpha", 1}}),
          [&](const Px &p) { return p == ToPx(kFrameCanvas) ? color : p; }}},
        0, kEveryDepth, true);
    Ref<Image> src = WindowedImage(16, 8, ImgRectI(2, 2, 10, 6), {}, 1);
    EXPECT_EQ(Through(src, {{"SetCanvasColor", Numbers({})}}).Get(), src.Get()); // the default colour is the input's
    EXPECT_EQ(OrvaneDoc().AddTool(OvID("SetBgColor"))->ClassID(), OvID("SetCanvasColor"));
}

} // namespace Orvane::colortest
