// Alpha Multiply and Alpha Divide against the formula written here in double, at every depth; the pair as a round
// trip; the frame every per-pixel tool keeps.
#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class MultiplyDivide : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

Px Multiplied(const Px &p) { return {p[0] * p[3], p[1] * p[3], p[2] * p[3], p[3]}; }
Px Divided(const Px &p) {
    if (p[3] == 0) return {0, 0, 0, 0};
    return {p[0] / p[3], p[1] / p[3], p[2] / p[3], p[3]};
}

const std::pair<const char *, PixelModel> kTools[] = {{"AlphaMultiply", Multiplied}, {"AlphaDivide", Divided}};

TEST_F(MultiplyDivide, EveryPixelFollowsTheFormulaAtEveryDepthAndTheFrameHolds) {
    for (const auto &[id, model] : kTools) {
        for (int depth : kEveryDepth) {
            Ref<Image> src = Orvane::Test::PatternImage(37, 11, depth, 5);
            Rig rig(id, src);
            Ref<Image> out = Render(rig.tool);
            ASSERT_TRUE(out && out.Get() != src.Get()) << id;
            ExpectModel(model, *src, *out, std::string(id) + " depth " + std::to_string(depth));
        }
        ExpectFrame(
            id, [](Operator *) {}, model);
    }
}

TEST_F(MultiplyDivide, EdgePixels) {
    struct Edge {
        const char *tool;
        FltPixel in, expected;
    };
    const Edge edges[] = {
        {"AlphaDivide", {0.3f, 0.2f, 0.1f, 0.f}, {0.f, 0.f, 0.f, 0.f}},      // alpha 0: colour 0, not infinity
        {"AlphaDivide", {0.3f, -0.2f, 0.f, 0.5f}, {0.6f, -0.4f, 0.f, 0.5f}}, // below black stays below
        {"AlphaDivide", {0.3f, 0.2f, 0.1f, -0.5f}, {-0.6f, -0.4f, -0.2f, -0.5f}},
        {"AlphaMultiply", {2.f, -1.f, 0.5f, 1.5f}, {3.f, -1.5f, 0.75f, 1.5f}}, // float has no ceiling
        {"AlphaMultiply", {0.3f, 0.2f, 0.1f, 0.f}, {0.f, 0.f, 0.f, 0.f}},
    };
    for (const Edge &e : edges) {
        Ref<Image> flat = NewImageTagList({{ImgWidth, 3}, {ImgHeight, 2}, {ImgDepth, DepthRGBAFlt32}});
        flat->Fill(e.in);
        Rig rig(e.tool, flat);
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out);
        Orvane::Test::ExpectPixelNear(out->GetFlt(1, 1), e.expected, 1e-7, e.tool);
    }
}

TEST_F(MultiplyDivide, DivideUndoesMultiplyWhereAlphaIsNotZeroAndAMaskPassesUnchanged) {
    Ref<Image> src = Orvane::Test::PatternImage(64, 9, DepthRGBAFlt32, 8);
    Rig rig("AlphaMultiply", src);
    Operator *divide = rig.doc.AddTool(OvID("AlphaDivide"));
    ASSERT_TRUE(divide->FindInput("Input")->ConnectTo(rig.tool->FindMainOutput()));
    Ref<Image> back = Render(divide);
    ASSERT_TRUE(back);
    for (int y = 0; y < 9; ++y)
        for (int x = 0; x < 64; ++x) {
            const Px in = UnitPx(*src, x, y), got = UnitPx(*back, x, y);
            for (int c = 0; c < 4; ++c)
                ASSERT_NEAR(got[c], in[3] == 0 && c < 3 ? 0.0 : in[c], 3e-7 * (1 + std::fabs(in[c]))) << x << "," << y;
        }
    Ref<Image> mask = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}, {ImgDepth, DepthAFlt32}});
    mask->Fill({0.f, 0.f, 0.f, 0.5f});
    for (const auto &[id, model] : kTools) {
        Rig maskRig(id, mask);
        EXPECT_EQ(Render(maskRig.tool).Get(), mask.Get()) << id;
    }
}

} // namespace
} // namespace Orvane::colortest
