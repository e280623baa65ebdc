#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using MultiplyDivide = ColorTool;
static Px Multiplied(const Px &p) { return {p[0] * p[3], p[1] * p[3], p[2] * p[3], p[3]}; }
static Px Divided(const Px &p) { return p[3] == 0 ? Px{} : Px{p[0] / p[3], p[1] / p[3], p[2] / p[3], p[3]}; }

// The frame's pattern holds alpha 0 (negative values clamped at integer depths), values below 0 and above 1.
TEST_F(MultiplyDivide, FormulaAtEveryDepthTheFrameAMaskHandedOnAndTheRoundTrip) {
    Ref<Image> mask = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}, {ImgDepth, DepthAFlt32}});
    for (const auto &[id, model] : {std::pair{"AlphaMultiply", &Multiplied}, {"AlphaDivide", &Divided}}) {
        ExpectFrame(id, {{Numbers({}), model}});
        EXPECT_EQ(Through(mask, {{id, Numbers({})}}).Get(), mask.Get()) << id;
    }
    Ref<Image> src = PatternImage(64, 9, DepthRGBAFlt32, 8);
    Ref<Image> back = Through(src, {{"AlphaMultiply", Numbers({})}, {"AlphaDivide", Numbers({})}});
    ASSERT_TRUE(back);
    ExpectModel([](const Px &p) { return p[3] == 0 ? Px{} : p; }, *src, *back, "round trip", 3e-7);
}

} // namespace Orvane::colortest
