// Color Matrix: each pixel against the sum written here, for matrices that swap, mix, offset and touch alpha;
// inversion as a round trip; the identity hands on; a singular matrix to invert fails with one line.
#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class CustomColorMatrix : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

using Matrix = std::array<std::array<double, 5>, 4>; ///< rows red, green, blue, alpha: four weights, an offset
constexpr Matrix kIdentity = {{{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}}};
constexpr Matrix kLuma = {{{.2126, .7152, .0722, 0, 0},
                           {.2126, .7152, .0722, 0, 0},
                           {.2126, .7152, .0722, 0, 0},
                           {0, 0, 0, 1, 0}}}; // singular

void SetMatrix(Operator *op, const Matrix &m, bool invert = false) {
    const char *names[4] = {"Red", "Green", "Blue", "Alpha"};
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j)
            Orvane::Test::SetNumber(
                op, (std::string(names[i]) + (j < 4 ? std::string("From") + names[j] : "Offset")).c_str(), m[i][j]);
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

TEST_F(CustomColorMatrix, TheMatrixSumAtEveryDepthInvertedAsARoundTrip) {
    const Matrix matrices[] = {
        {{{0, 0, 1, 0, 0}, {0, 1, 0, 0, 0}, {1, 0, 0, 0, 0}, {0, 0, 0, 1, 0}}}, // swap red and blue
        {{{1.2, -0.1, 0.05, 0, 0.02},
          {0.1, 0.9, 0, 0, -0.03},
          {0, 0.2, 0.7, 0.1, 0.1},
          {0, 0, 0, 1, 0}}},                                                          // mix, offsets
        {{{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0.5, 0, 0.5, 0.1}}}, // alpha from green
    };
    Ref<Image> src = Orvane::Test::PatternImage(40, 6, DepthRGBAFlt32, 4);
    for (const Matrix &m : matrices) {
        // The host applies matrices in float: integer results may round the other way within float's error.
        ExpectFrame(
            "CustomColorMatrix", [m](Operator *op) { SetMatrix(op, m); }, Model(m), 2e-6);
        Rig rig("CustomColorMatrix", src);
        SetMatrix(rig.tool, m);
        Operator *back = rig.Then("CustomColorMatrix");
        SetMatrix(back, m, true);
        ExpectModel([](const Px &p) { return p; }, *src, *Render(back), "inverted", 2e-6);
    }
    ExpectFrame("CustomColorMatrix", [](Operator *op) { SetMatrix(op, kLuma); }, Model(kLuma), 2e-6, {DepthRGBAInt8});
    Rig rig("CustomColorMatrix", src);
    SetMatrix(rig.tool, kIdentity, true);
    EXPECT_EQ(Render(rig.tool).Get(), src.Get());
}

TEST_F(CustomColorMatrix, ASingularMatrixToInvertFailsWithOneLine) {
    Rig rig("CustomColorMatrix", Orvane::Test::PatternImage(8, 4));
    rig.tool->SetName("Mixer");
    SetMatrix(rig.tool, kLuma, true);
    EXPECT_FALSE(Render(rig.tool));
    EXPECT_EQ(Orvane::Test::ConsoleText(rig.doc),
              "error: Mixer: the matrix cannot be inverted (its determinant is 0)\n");
}

} // namespace
} // namespace Orvane::colortest
