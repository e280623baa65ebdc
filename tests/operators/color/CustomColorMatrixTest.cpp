// Color Matrix: each pixel against the sum written here, for matrices that swap, mix, offset and touch alpha;
// inversion as a round trip; the identity hands on; a singular matrix to invert fails with one line.
#include <numeric>

#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

using CustomColorMatrix = ColorTool;
using Matrix = std::array<std::array<double, 5>, 4>; ///< rows red, green, blue, alpha: four weights, an offset

void SetMatrix(Operator *op, const Matrix &m, bool invert = false) {
    const std::string names[4] = {"Red", "Green", "Blue", "Alpha"};
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j)
            Test::SetNumber(op, (names[i] + (j < 4 ? "From" + names[j] : "Offset")).c_str(), m[i][j]);
    Test::SetNumber(op, "Invert", invert);
}

TEST_F(CustomColorMatrix, TheMatrixSumAtEveryDepthInvertedAsARoundTripAndSingularFails) {
    const Matrix luma = {
        {{.2126, .7152, .0722, 0, 0}, {.2126, .7152, .0722, 0, 0}, {.2126, .7152, .0722, 0, 0}, {0, 0, 0, 1, 0}}};
    const Matrix matrices[] = {
        {{{0, 0, 1, 0, 0}, {0, 1, 0, 0, 0}, {1, 0, 0, 0, 0}, {0, 0, 0, 1, 0}}}, // swap red, blue
        {{{1.2, -0.1, 0.05, 0, 0.02},
          {0.1, 0.9, 0, 0, -0.03},
          {0, 0.2, 0.7, 0.1, 0.1},
          {0, 0, 0, 1, 0}}},                                                          // mix, offsets
        {{{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0.5, 0, 0.5, 0.1}}}, // alpha from green
        luma};
    std::vector<Setting> settings;
    Ref<Image> src = Orvane::Test::PatternImage(40, 6, DepthRGBAFlt32, 4);
    for (const Matrix &m : matrices) {
        settings.push_back({[m](Operator *op) { SetMatrix(op, m); },
                            [m](const Px &p) {
                                Px out;
                                for (int i = 0; i < 4; ++i)
                                    out[i] = std::inner_product(p.begin(), p.end(), m[i].begin(), m[i][4]);
                                return out;
                            }});
        if (m == luma) break;
        Rig rig("CustomColorMatrix", src);
        SetMatrix(rig.tool, m);
        Operator *back = rig.Then("CustomColorMatrix");
        SetMatrix(back, m, true);
        ExpectModel([](const Px &p) { return p; }, *src, *Render(back), "inverted", 2e-6);
    }
    // The host applies matrices in float: integer results may round the other way within float's error.
    ExpectFrame("CustomColorMatrix", settings, 2e-6);
    Rig rig("CustomColorMatrix", src);
    SetMatrix(rig.tool, {{{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}}}, true);
    EXPECT_EQ(Render(rig.tool).Get(), src.Get());
    rig.tool->SetName("Mixer");
    SetMatrix(rig.tool, luma, true);
    EXPECT_FALSE(Render(rig.tool));
    EXPECT_EQ(Orvane::Test::ConsoleText(rig.doc),
              "error: Mixer: the matrix cannot be inverted (its determinant is 0)\n");
}

} // namespace
} // namespace Orvane::colortest
