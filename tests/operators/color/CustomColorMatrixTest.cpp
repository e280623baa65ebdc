// Color Matrix: each pixel against the sum written here in double, at every depth and for matrices that swap, mix,
// offset and touch alpha; inversion as a round trip; the identity hands on; a singular matrix fails with one line.
#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class CustomColorMatrix : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

/// Rows red, green, blue, alpha: four weights and an offset.
using Matrix = std::array<std::array<double, 5>, 4>;
constexpr Matrix kIdentity = {{{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}}};

void SetMatrix(Operator *op, const Matrix &m, bool invert = false) {
    const char *names[4] = {"Red", "Green", "Blue", "Alpha"};
    std::vector<std::pair<std::string, double>> values;
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j)
            values.emplace_back(std::string(names[i]) + (j < 4 ? std::string("From") + names[j] : "Offset"), m[i][j]);
    for (const auto &[id, v] : values) Orvane::Test::SetNumber(op, id.c_str(), v);
    Orvane::Test::SetNumber(op, "Invert", invert);
}

PixelModel Model(const Matrix &m) {
    return [m](const Px &p) {
        Px out;
        for (int i = 0; i < 4; ++i)
            out[i] = m[i][0] * p[0] + m[i][1] * p[1] + m[i][2] * p[2] + m[i][3] * p[3] + m[i][4];
        return out;
    };
}

const std::pair<const char *, Matrix> kMatrices[] = {
    {"swap red and blue", {{{0, 0, 1, 0, 0}, {0, 1, 0, 0, 0}, {1, 0, 0, 0, 0}, {0, 0, 0, 1, 0}}}},
    {"luma into every channel",
     {{{.2126, .7152, .0722, 0, 0}, {.2126, .7152, .0722, 0, 0}, {.2126, .7152, .0722, 0, 0}, {0, 0, 0, 1, 0}}}},
    {"mix with offsets",
     {{{1.2, -0.1, 0.05, 0, 0.02}, {0.1, 0.9, 0, 0, -0.03}, {0, 0.2, 0.7, 0.1, 0.1}, {0, 0, 0, 1, 0}}}},
    {"alpha from green, offset", {{{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0.5, 0, 0.5, 0.1}}}},
};

TEST_F(CustomColorMatrix, EveryPixelIsTheMatrixSumAtEveryDepthAndTheFrameHolds) {
    for (const auto &[name, m] : kMatrices) {
        // The host applies matrices in float: integer results may round the other way within float's error.
        const double slack = 4e-7 * 4;
        for (int depth : kEveryDepth) {
            Ref<Image> src = Orvane::Test::PatternImage(29, 9, depth, 3);
            Rig rig("CustomColorMatrix", src);
            SetMatrix(rig.tool, m);
            Ref<Image> out = Render(rig.tool);
            ASSERT_TRUE(out) << name;
            ExpectModel(Model(m), *src, *out, std::string(name) + " depth " + std::to_string(depth), slack);
        }
        ExpectFrame(
            "CustomColorMatrix", [m = m](Operator *op) { SetMatrix(op, m); }, Model(m), slack);
    }
}

TEST_F(CustomColorMatrix, InvertUndoesTheMatrixAndTheIdentityHandsOn) {
    Ref<Image> src = Orvane::Test::PatternImage(40, 6, DepthRGBAFlt32, 4);
    for (const auto &[name, m] : kMatrices) {
        if (m[1][0] == m[0][0] && m[2][0] == m[0][0]) continue; // the luma matrix is singular
        Rig rig("CustomColorMatrix", src);
        SetMatrix(rig.tool, m);
        Operator *back = rig.doc.AddTool(OvID("CustomColorMatrix"));
        ASSERT_TRUE(back->FindInput("Input")->ConnectTo(rig.tool->FindMainOutput()));
        SetMatrix(back, m, true);
        Ref<Image> out = Render(back);
        ASSERT_TRUE(out) << name;
        ExpectModel([](const Px &p) { return p; }, *src, *out, name, 2e-6);
    }
    Rig rig("CustomColorMatrix", src);
    EXPECT_EQ(Render(rig.tool).Get(), src.Get());
    SetMatrix(rig.tool, kIdentity, true);
    EXPECT_EQ(Render(rig.tool).Get(), src.Get());
}

TEST_F(CustomColorMatrix, ASingularMatrixToInvertFailsWithOneLine) {
    Rig rig("CustomColorMatrix", Orvane::Test::PatternImage(8, 4));
    rig.tool->SetName("Mixer");
    SetMatrix(rig.tool, kMatrices[1].second, true);
    EXPECT_FALSE(Render(rig.tool));
    EXPECT_EQ(Orvane::Test::ConsoleText(rig.doc),
              "error: Mixer: the matrix cannot be inverted (its determinant is 0)\n");
    SetMatrix(rig.tool, kMatrices[1].second, false); // not inverted, the same matrix works
    EXPECT_TRUE(Render(rig.tool));
}

} // namespace
} // namespace Orvane::colortest
