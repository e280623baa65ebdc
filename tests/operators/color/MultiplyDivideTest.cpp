// Alpha Multiply and Alpha Divide against their formulas written here, edge pixels, the pair as a round trip.
#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class MultiplyDivide : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

Px Multiplied(const Px &p) { return {p[0] * p[3], p[1] * p[3], p[2] * p[3], p[3]}; }
Px Divided(const Px &p) { return p[3] == 0 ? Px{} : Px{p[0] / p[3], p[1] / p[3], p[2] / p[3], p[3]}; }

TEST_F(MultiplyDivide, FormulaAtEveryDepthEdgePixelsAndTheFrame) {
    for (const auto &[id, model] : {std::pair{"AlphaMultiply", &Multiplied}, {"AlphaDivide", &Divided}}) {
        ExpectFrame(
            id, [](Operator *) {}, model);
        // Alpha 0 divides to 0, not infinity; below black stays below; float has no ceiling.
        for (const FltPixel &in :
             {FltPixel{0.3f, 0.2f, 0.1f, 0.f}, {0.3f, -0.2f, 2.f, 0.5f}, {2.f, -1.f, 0.5f, -1.5f}}) {
            Ref<Image> flat = NewImageTagList({{ImgWidth, 3}, {ImgHeight, 2}, {ImgDepth, DepthRGBAFlt32}});
            flat->Fill(in);
            Rig rig(id, flat);
            ExpectModel(model, *flat, *Render(rig.tool), id);
        }
    }
}

TEST_F(MultiplyDivide, DivideUndoesMultiplyAndAMaskPassesUnchanged) {
    Ref<Image> src = Orvane::Test::PatternImage(64, 9, DepthRGBAFlt32, 8);
    Rig rig("AlphaMultiply", src);
    Ref<Image> back = Render(rig.Then("AlphaDivide"));
    ASSERT_TRUE(back);
    ExpectModel([](const Px &p) { return p[3] == 0 ? Px{0, 0, 0, 0} : p; }, *src, *back, "round trip", 3e-7);
    Ref<Image> mask = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}, {ImgDepth, DepthAFlt32}});
    for (const char *id : {"AlphaMultiply", "AlphaDivide"}) {
        Rig maskRig(id, mask);
        EXPECT_EQ(Render(maskRig.tool).Get(), mask.Get()) << id;
    }
}

} // namespace
} // namespace Orvane::colortest
