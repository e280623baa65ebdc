// RGB to and from HSV, HLS and CIE L*a*b* (D65): known and published values, round trips over a grid with
// out-of-range values, hue wrapping, and the colours a space cannot hold.
#include "host/color/ColorSpace.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <tuple>

#include <gtest/gtest.h>

using namespace Orvane;

namespace {

using Triple = std::array<float, 3>;
constexpr ColorSpaceType HSV = ColorSpaceType::HSV, HLS = ColorSpaceType::HLS, LAB = ColorSpaceType::LAB,
                         RGB = ColorSpaceType::RGB;

Triple Convert(bool toSpace, ColorSpaceType s, const Triple &in) {
    Triple out;
    (toSpace ? RGBToSpace : SpaceToRGB)(s, in.data(), out.data());
    return out;
}

::testing::AssertionResult Near(const Triple &got, const std::array<double, 3> &want, double tol) {
    for (int i = 0; i < 3; ++i)
        if (!(std::fabs(got[i] - want[i]) <= tol))
            return ::testing::AssertionFailure() << "component " << i << ": got " << got[i] << ", want " << want[i];
    return ::testing::AssertionSuccess();
}

} // namespace

TEST(ColorSpace, KnownColoursBothWaysAndRoundTripsOverAGridAndInPlace) {
    const double cube = 116 * std::cbrt(0.18f) - 16; // L* of 18% grey
    const std::tuple<bool, ColorSpaceType, Triple, std::array<double, 3>, double> cases[] = {
        // HSV: the six hues, orange at half brightness (a quarter of the way to yellow), greys with hue 0.
        {true, HSV, {1, 0, 0}, {0, 1, 1}, 1e-6},
        {true, HSV, {1, 1, 0}, {1.0 / 6, 1, 1}, 1e-6},
        {true, HSV, {0, 1, 0}, {2.0 / 6, 1, 1}, 1e-6},
        {true, HSV, {0, 1, 1}, {3.0 / 6, 1, 1}, 1e-6},
        {true, HSV, {0, 0, 1}, {4.0 / 6, 1, 1}, 1e-6},
        {true, HSV, {1, 0, 1}, {5.0 / 6, 1, 1}, 1e-6},
        {true, HSV, {0.5f, 0.125f, 0}, {0.25 / 6, 1, 0.5}, 1e-6},
        {true, HSV, {0.3f, 0.3f, 0.3f}, {0, 0, 0.3}, 1e-6},
        {true, HSV, {0, -0.5f, -0.1f}, {0, 0, 0}, 0}, // largest channel 0 with chroma: black
        // HLS: pink L = (0.75 + 0.25) / 2, S = 0.5 / (1 - |2L - 1|); light cyan above L = 0.5, dark green below.
        {true, HLS, {1, 0, 0}, {0, 0.5, 1}, 1e-6},
        {true, HLS, {1, 1, 1}, {0, 1, 0}, 1e-6},
        {true, HLS, {0.75f, 0.25f, 0.25f}, {0, 0.5, 0.5}, 1e-6},
        {true, HLS, {0.8f, 1.0f, 1.0f}, {0.5, 0.9, 0.2 / (2 - 2 * 0.9)}, 1e-6},
        {true, HLS, {0.1f, 0.3f, 0.1f}, {1.0 / 3, 0.2, 0.5}, 1e-6},
        {true, HLS, {0.5f, -0.5f, 0}, {0, 0, 0}, 0}, // lightness exactly 0 or 1 with chroma: a grey
        {true, HLS, {1.5f, 0.5f, 1}, {0, 1, 0}, 0},
        // Lab: D65 white, black, published values of the sRGB primaries, greys on the
        // cube-root part (116 Y^(1/3) - 16) and the linear one (24389/27 Y), over-white.
        {true, LAB, {1, 1, 1}, {100, 0, 0}, 1e-4},
        {true, LAB, {0, 0, 0}, {0, 0, 0}, 1e-6},
        {true, LAB, {1, 0, 0}, {53.24, 80.09, 67.20}, 0.05},
        {true, LAB, {0, 1, 0}, {87.73, -86.18, 83.18}, 0.05},
        {true, LAB, {0, 0, 1}, {32.30, 79.19, -107.86}, 0.05},
        {true, LAB, {0.18f, 0.18f, 0.18f}, {cube, 0, 0}, 1e-4},
        {true, LAB, {0.001f, 0.001f, 0.001f}, {24389.0 / 27 * 0.001f, 0, 0}, 1e-4},
        {true, LAB, {8, 8, 8}, {116 * 2 - 16, 0, 0}, 1e-3},
        // Back to RGB (the round trips below hold the rest): hues outside one turn wrap; RGB and unknown spaces copy.
        {false, HSV, {1.0f, 1, 1}, {1, 0, 0}, 1e-6},
        {false, HSV, {1.25f, 1, 1}, {0.5, 1, 0}, 1e-6},
        {false, HSV, {-0.75f, 1, 1}, {0.5, 1, 0}, 1e-6},
        {false, HLS, {-2.0f / 3, 0.5f, 1}, {0, 1, 0}, 1e-6},
        {false, HLS, {1.0f, 0.5f, 1}, {1, 0, 0}, 1e-6},
        {false, HLS, {0, 1, 0}, {1, 1, 1}, 0},
        {true, RGB, {-1.5f, 0.25f, 7}, {-1.5, 0.25, 7}, 0},
        {false, RGB, {-1.5f, 0.25f, 7}, {-1.5, 0.25, 7}, 0},
        {true, static_cast<ColorSpaceType>(3), {0.1f, 0.2f, 0.3f}, {0.1f, 0.2f, 0.3f}, 0},
        {false, static_cast<ColorSpaceType>(42), {0.1f, 0.2f, 0.3f}, {0.1f, 0.2f, 0.3f}, 0},
    };
    for (const auto &[toSpace, space, in, want, tol] : cases)
        EXPECT_TRUE(Near(Convert(toSpace, space, in), want, tol))
            << (toSpace ? "to" : "from") << " space " << static_cast<int>(space) << ": " << in[0] << " " << in[1] << " "
            << in[2];
    // Just short of red through magenta the hue is a hair under 1, not 1.
    for (ColorSpaceType s : {HSV, HLS}) {
        const Triple h = Convert(true, s, {1.0f, 0.0f, 1e-9f});
        EXPECT_TRUE(h[0] >= 0.0f && h[0] < 1.0f) << h[0];
        EXPECT_TRUE(Near(Convert(false, s, h), {1, 0, 0}, 1e-6));
    }
    // Greys where all three match, primaries and secondaries at 0 and 1, and
    // negatives and values over 1 for out-of-range pixels.
    const float grid[] = {-0.5f, -0.1f, 0.0f, 0.05f, 0.18f, 0.5f, 0.75f, 1.0f, 1.25f, 2.5f};
    for (ColorSpaceType s : {RGB, HLS, HSV, LAB}) {
        int checked = 0;
        for (float r : grid)
            for (float g : grid)
                for (float b : grid) {
                    const float mx = std::max({r, g, b}), mn = std::min({r, g, b});
                    // Colours the space cannot hold (see the header): checked above.
                    if (mx > mn && s == HSV && mx == 0.0f) continue;
                    if (mx > mn && s == HLS && (mx + mn == 0.0f || mx + mn == 2.0f)) continue;
                    const Triple c = Convert(true, s, {r, g, b});
                    if (s == HLS || s == HSV) {
                        EXPECT_TRUE(c[0] >= 0.0f && c[0] < 1.0f) << c[0];
                    }
                    const double tol = 2e-6 * std::max({1.0f, std::fabs(mx), std::fabs(mn)});
                    EXPECT_TRUE(Near(Convert(false, s, c), {r, g, b}, tol))
                        << "space " << static_cast<int>(s) << " rgb " << r << " " << g << " " << b;
                    ++checked;
                }
        EXPECT_GT(checked, 900);
        float px[3] = {0.2f, 0.7f, 1.4f}; // in place: input and output the same array
        RGBToSpace(s, px, px);
        SpaceToRGB(s, px, px);
        EXPECT_TRUE(Near({px[0], px[1], px[2]}, {0.2f, 0.7f, 1.4f}, 1e-6)) << static_cast<int>(s);
    }
}
