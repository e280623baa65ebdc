#include <numeric>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using CustomColorMatrix = ColorTool;
using Matrix = std::array<std::array<double, 5>, 4>; ///< rows red, green, blue, alpha: four weights, an offset

static Setter Set(const Matrix &m, bool invert = false) {
    return [=](Operator *op) {
        const std::string names[4] = {"Red", "Green", "Blue", "Alpha"};
        for (int i = 0; i < 4; ++i)
            for (int j = 0; j < 5; ++j)
                Test::SetNumber(op, (names[i] + (j < 4 ? "From" + names[j] : "Offset")).c_str(), m[i][j]);
        Test::SetNumber(op, "Invert", invert);
    };
}
static Px Times(const Matrix &m, const Px &p) {
    const auto dot = [&](int i) { return std::inner_product(p.begin(), p.end(), m[i].begin(), m[i][4]); };
    return {dot(0), dot(1), dot(2), dot(3)};
}

TEST_F(CustomColorMatrix, TheMatrixSumAtEveryDepthInvertedAsARoundTripAndSingularFails) {
    // Red and blue swapped; a mix with offsets; alpha from green and itself; luminance everywhere (singular).
    const Matrix matrices[] = {
        {{{0, 0, 1, 0, 0}, {0, 1, 0, 0, 0}, {1, 0, 0, 0, 0}, {0, 0, 0, 1, 0}}},
        {{{1.2, -0.1, 0.05, 0, 0.02}, {0.1, 0.9, 0, 0, -0.03}, {0, 0.2, 0.7, 0.1, 0.1}, {0, 0, 0, 1, 0}}},
        {{{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0.5, 0, 0.5, 0.1}}},
        {{{.2126, .7152, .0722, 0, 0}, {.2126, .7152, .0722, 0, 0}, {.2126, .7152, .0722, 0, 0}, {0, 0, 0, 1, 0}}}};
    std::vector<Setting> settings;
    Ref<Image> src = PatternImage(40, 6, DepthRGBAFlt32, 4);
    for (const Matrix &m : matrices) {
        settings.push_back({Set(m), [m](const Px &p) { return Times(m, p); }});
        if (&m == &matrices[3]) break;
        Ref<Image> back = Through(src, {{"CustomColorMatrix", Set(m)}, {"CustomColorMatrix", Set(m, true)}});
        ExpectModel(kIdentity, *src, *back, "inverted", 2e-6);
    }
    ExpectFrame("CustomColorMatrix", settings, 2e-6); // applied in float: integers may round the other way
    const Matrix identity = {{{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}}};
    EXPECT_EQ(Through(src, {{"CustomColorMatrix", Set(identity, true)}}).Get(), src.Get()); // the identity hands on
    Rig rig("CustomColorMatrix", src);
    rig.tool->SetName("Mixer");
    Set(matrices[3], true)(rig.tool);
    EXPECT_FALSE(Render(rig.tool));
    EXPECT_EQ(ConsoleText(rig.doc), "error: Mixer: the matrix cannot be inverted (its determinant is 0)\n");
}

} // namespace Orvane::colortest
