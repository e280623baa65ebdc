#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using MultiplyDivide = ColorTool;

static Px Multiplied(const Px &p) { return {p[0] * p[3], p[1] * p[3], p[2] * p[3], p[3]}; }
static Px Divided(const Px &p) { return p[3] == 0 ? Px{} : Px{p[0] / p[3], p[1] / p[3], p[2] / p[3], p[3]}; }

TEST_F(MultiplyDivide, FormulaAtEveryDepthEdgePixelsTheFrameAndTheRoundTrip) {
    // Alpha 0 divides to 0, not infinity; below black stays below; float has no ceiling; a mask passes unchanged.
    const FltPixel edge[] = {{0.3f, 0.2f, 0.1f, 0.f}, {0.3f, -0.2f, 2.f, 0.5f}, {2.f, -1.f, 0.5f, -1.5f}};
    Ref<Image> edges = NewImageTagList({{ImgWidth, 3}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    for (int x = 0; x < 3; ++x) edges->FillWithin(edge[x], ImgRectI(x, 0, x + 1, 1));
    Ref<Image> mask = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}, {ImgDepth, DepthAFlt32}});
    for (const auto &[id, model] : {std::pair{"AlphaMultiply", &Multiplied}, {"AlphaDivide", &Divided}}) {
        ExpectFrame(id, {{Numbers({}), model}});
        Rig rig(id, edges), maskRig(id, mask);
        ExpectModel(model, *edges, *Render(rig.tool), id);
        EXPECT_EQ(Render(maskRig.tool).Get(), mask.Get()) << id;
    }
    Ref<Image> src = Orvane::Test::PatternImage(64, 9, DepthRGBAFlt32, 8);
    Rig rig("AlphaMultiply", src);
    Ref<Image> back = Render(rig.Then("AlphaDivide"));
    ASSERT_TRUE(back);
    ExpectModel([](const Px &p) { return p[3] == 0 ? Px{} : p; }, *src, *back, "round trip", 3e-7);
}

} // namespace Orvane::colortest
