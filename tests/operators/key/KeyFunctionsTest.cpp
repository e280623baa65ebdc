// The keyers' per-pixel functions against models written here from the
// arithmetic, in double: the chroma box with its soft edge, the channel
// values of the luma key (hue of the primaries and secondaries, saturation of
// grey), the threshold ramp with its inclusive ends; and the 16-bit forms
// against the float ones over a grid of 16-bit pixels. The difference key is
// checked through the tool (KeyerToolsTest.cpp).
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <string>

#include "operators/key/KeyFunctions.h"
#include "tests/operators/key/KeyModels.h"

namespace Orvane {
namespace {

using namespace keytest;

TEST(ChromaKeyFunction, BoxEndsIncludedSoftEdgeAndHardBox) {
    const ChromaKeyRanges plain = Ranges(1, {0.25f, 0.5f, 0.f, 0.f}, {0.75f, 1.f, 0.5f, 1.f}, 0.f);
    const ChromaKeyRanges soft = Ranges(1, {0.25f, 0.5f, 0.f, 0.f}, {0.75f, 1.f, 0.5f, 1.f}, 0.125f);
    // Black's chroma axes are exactly 0.5 and its luminance 0: a box of zero
    // width around it still holds it.
    const ChromaKeyRanges point = Ranges(0, {0.5f, 0.5f, 0.5f, 0.f}, {0.5f, 0.5f, 0.5f, 0.f}, 0.f);
    const ChromaKeyRanges green = Ranges(0, {0.f, 0.6f, 0.f, 0.2f}, {0.45f, 1.f, 0.5f, 0.8f}, 0.0625f);
    struct Case {
        const ChromaKeyRanges *k;
        Rgb c;
        double alpha; ///< worked out by hand; < 0: the model's
    };
    const Case cases[] = {
        {&plain, {0.25, 0.5, 0.0}, 0.0},                                         // every low end
        {&plain, {0.75, 1.0, 0.5}, 0.0},                                         // every high end
        {&plain, {0.5, 0.75, 0.25}, 0.0},                                        // inside
        {&plain, {0.2, 0.75, 0.25}, 1.0},                                        // below on red: hard
        {&plain, {0.5, 0.75, 0.5625}, 1.0},                                      // above on blue: hard
        {&soft, {0.1875, 0.75, 0.25}, 0.5},                                      // 1/16 below red over 1/8
        {&soft, {0.5, 0.75, 0.53125}, 0.25},                                     // 1/32 above blue
        {&soft, {0.0, 0.75, 0.25}, 1.0},                                         // beyond the soft range
        {&soft, {0.1875, 0.4375, 0.25}, 0.5},                                    // two axes out: the larger counts
        {&point, {0.0, 0.0, 0.0}, 0.0},       {&point, {0.01, 0.01, 0.01}, 1.0}, // grey: chroma 0.5, luminance out
        {&point, {0.01, 0.0, 0.0}, 1.0},      {&green, {0.1, 0.8, 0.15}, -1},    // a green screen pixel: inside
        {&green, {0.5, 0.45, 0.4}, -1},                                          // skin: far out
        {&green, {0.3, 0.6, 0.3}, -1},                                           // desaturated green: on the soft edge
        {&green, {0.2, 0.9, 0.1}, -1},
    };
    for (const Case &c : cases) {
        const std::string at = std::to_string(c.c[0]) + "," + std::to_string(c.c[1]) + "," + std::to_string(c.c[2]);
        const double want = c.alpha >= 0 ? c.alpha : ChromaModel(*c.k, c.c);
        if (c.alpha >= 0) {
            EXPECT_NEAR(ChromaModel(*c.k, c.c), c.alpha, 1e-12) << "model " << at;
        }
        EXPECT_NEAR(ChromaKeyAlpha(*c.k, float(c.c[0]), float(c.c[1]), float(c.c[2])), want, 2e-5) << at;
    }
    // The green screen case holds pixels on both sides of its soft edge.
    EXPECT_EQ(ChromaKeyAlpha(green, 0.1f, 0.8f, 0.15f), 0.f);
    const float edge = ChromaKeyAlpha(green, 0.3f, 0.6f, 0.3f);
    EXPECT_GT(edge, 0.f);
    EXPECT_LT(edge, 1.f);
}

TEST(ChromaKeyFunction, SixteenBitFormFollowsTheFloatForm) {
    // Plain colour with the luminance unbounded: the axes are the stored
    // values and the limits rounded to steps, so the distance is within a
    // step, which the soft range divides. The chroma axes are truncated to
    // steps as well (three at most).
    const ChromaKeyRanges cases[] = {
        Ranges(1, {0.2f, 0.3f, 0.1f, 0.f}, {0.6f, 0.9f, 0.4f, 1.f}, 0.25f),
        Ranges(1, {0.2f, 0.3f, 0.1f, 0.f}, {0.6f, 0.9f, 0.4f, 1.f}, 1.f),
        Ranges(0, {0.3f, 0.55f, 0.2f, 0.1f}, {0.5f, 0.9f, 0.5f, 0.9f}, 0.25f),
        Ranges(0, {0.0f, 0.6f, 0.0f, 0.0f}, {0.45f, 1.0f, 0.5f, 1.0f}, 0.5f),
    };
    for (const ChromaKeyRanges &k : cases) {
        const ChromaKeyRanges16 k16(k);
        const double tol = (1.0 + (k.keyType == 1 ? 1.0 : 4.0) / k.soft) / 65535 + 1e-6;
        for (int r = 0; r <= 65535; r += 4369)
            for (int g = 0; g <= 65535; g += 4369)
                for (int b = 0; b <= 65535; b += 4369) {
                    const Rgb c = {r / 65535.0, g / 65535.0, b / 65535.0};
                    ASSERT_NEAR(ChromaKeyAlpha16(k16, r, g, b) / 65535.0, ChromaModel(k, c), tol)
                        << "key type " << k.keyType << " at " << r << "," << g << "," << b;
                }
    }
}

TEST(LumaKeyFunction, ChannelValues) {
    struct Case {
        Rgb c;
        double hue, saturation;
    };
    const Case cases[] = {
        {{1, 0, 0}, 0.0, 1.0},          {{1, 1, 0}, 1.0 / 6, 1.0},      {{0, 1, 0}, 1.0 / 3, 1.0},
        {{0, 1, 1}, 0.5, 1.0},          {{0, 0, 1}, 2.0 / 3, 1.0},      {{1, 0, 1}, 5.0 / 6, 1.0},
        {{0.5, 0.5, 0.5}, 0.0, 0.0},    {{0, 0, 0}, 0.0, 0.0},          {{0.8, 0.4, 0.2}, -1, 0.75},
        {{0.2, 0.3, 0.9}, -1, 7.0 / 9}, {{0.6, 0.2, 0.4}, -1, 2.0 / 3}, {{0.25, 0.5, 0.3}, -1, 0.5},
    };
    for (const Case &c : cases) {
        const std::string at = std::to_string(c.c[0]) + "," + std::to_string(c.c[1]) + "," + std::to_string(c.c[2]);
        const float r = float(c.c[0]), g = float(c.c[1]), b = float(c.c[2]);
        const double hue = c.hue >= 0 ? c.hue : HueModel(c.c);
        if (c.hue >= 0) {
            EXPECT_NEAR(HueModel(c.c), c.hue, 1e-12) << "model " << at;
        }
        EXPECT_NEAR(LumaKeyValue(LumaHue, r, g, b, 0.3f, 0.f), hue, 1e-6) << at;
        EXPECT_NEAR(LumaKeyValue(LumaSaturation, r, g, b, 0.3f, 0.f), c.saturation, 1e-6) << at;
        EXPECT_NEAR(LumaKeyValue(LumaLuminance, r, g, b, 0.3f, 0.f), Luma(c.c), 1e-6) << at;
        const float direct[4] = {b, g, r, 0.3f};
        for (int ch = LumaBlue; ch <= LumaAlpha; ++ch) EXPECT_EQ(LumaKeyValue(ch, r, g, b, 0.3f, 0.f), direct[ch]);
        EXPECT_EQ(LumaKeyValue(LumaDepth, r, g, b, 0.3f, 7.5f), 7.5f);
    }
}

TEST(LumaKeyFunction, ThresholdEndsAndEqualLimits) {
    struct Case {
        float v, low, high;
        double alpha;
    };
    const Case cases[] = {
        {0.2f, 0.2f, 0.6f, 0.0},
        {0.6f, 0.2f, 0.6f, 1.0},
        {0.3f, 0.2f, 0.6f, 0.25},
        {0.5f, 0.2f, 0.6f, 0.75},
        {0.1f, 0.2f, 0.6f, 0.0},
        {0.9f, 0.2f, 0.6f, 1.0},
        // Low = High: a hard step, no division reached.
        {0.4f, 0.4f, 0.4f, 0.0},
        {0.40001f, 0.4f, 0.4f, 1.0},
        {0.39999f, 0.4f, 0.4f, 0.0},
        // High below Low: 0 up to Low, then 1.
        {0.5f, 0.6f, 0.2f, 0.0},
        {0.7f, 0.6f, 0.2f, 1.0},
    };
    for (const Case &c : cases) {
        const float inverse = c.high > c.low ? 1.f / (c.high - c.low) : 0.f;
        EXPECT_NEAR(KeyThreshold(c.v, c.low, c.high, inverse), c.alpha, 1e-6)
            << c.v << " in " << c.low << ".." << c.high;
        // The same ramp over steps; the hard step exactly.
        EXPECT_NEAR(KeyThreshold16(KeySteps16(c.v), KeySteps16(c.low), KeySteps16(c.high)) / 65535.0, c.alpha,
                    c.high <= c.low ? 0.0 : (1.0 + 0.5 / (c.high - c.low)) / 65535)
            << "16-bit " << c.v;
    }
}

TEST(LumaKeyFunction, SixteenBitValuesWithinAStep) {
    for (int ch = LumaBlue; ch <= LumaHue; ++ch)
        for (int r = 0; r <= 65535; r += 3855)
            for (int g = 0; g <= 65535; g += 4369)
                for (int b = 0; b <= 65535; b += 5461) {
                    const Rgb c = {r / 65535.0, g / 65535.0, b / 65535.0};
                    double want = ch == LumaHue ? HueModel(c) : ch == LumaLuminance ? Luma(c) : SaturationModel(c);
                    if (ch <= LumaAlpha) want = std::array<double, 4>{c[2], c[1], c[0], 0.5}[ch];
                    const int32_t v = LumaKeyValue16(ch, r, g, b, 32768);
                    // Hue wraps: just below 1 and 0 are neighbours.
                    double d = std::fabs(v / 65535.0 - want);
                    if (ch == LumaHue) d = std::min(d, 1.0 - d);
                    ASSERT_LE(d, 1.0 / 65535 + 1e-6) << "channel " << ch << " at " << r << "," << g << "," << b;
                }
}

} // namespace
} // namespace Orvane
