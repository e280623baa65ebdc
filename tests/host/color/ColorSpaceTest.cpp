#include "host/color/ColorSpace.h"

#include <algorithm>
#include <cmath>
#include <vector>

#include <gtest/gtest.h>

using namespace Orvane;

namespace {

struct CsTriple {
    float v[3];
};

CsTriple CsToSpace(ColorSpaceType s, float a, float b, float c) {
    float in[3] = {a, b, c};
    CsTriple r;
    RGBToSpace(s, in, r.v);
    return r;
}

CsTriple CsFromSpace(ColorSpaceType s, float a, float b, float c) {
    float in[3] = {a, b, c};
    CsTriple r;
    SpaceToRGB(s, in, r.v);
    return r;
}

void ExpectCsTriple(const CsTriple &got, double a, double b, double c, double tol) {
    EXPECT_NEAR(got.v[0], a, tol);
    EXPECT_NEAR(got.v[1], b, tol);
    EXPECT_NEAR(got.v[2], c, tol);
}

// Channel values for the round-trip grid: greys appear where all three match,
// primaries and secondaries where they are 0 and 1, and negatives and values
// over 1 stand for out-of-range pixels.
const float kCsGrid[] = {-0.5f, -0.1f, 0.0f, 0.05f, 0.18f, 0.5f, 0.75f, 1.0f, 1.25f, 2.5f};

} // namespace

TEST(ColorSpace, HSVOfKnownColours) {
    const double tol = 1e-6;
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 1, 0, 0), 0.0, 1, 1, tol);
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 1, 1, 0), 1.0 / 6, 1, 1, tol);
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 0, 1, 0), 2.0 / 6, 1, 1, tol);
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 0, 1, 1), 3.0 / 6, 1, 1, tol);
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 0, 0, 1), 4.0 / 6, 1, 1, tol);
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 1, 0, 1), 5.0 / 6, 1, 1, tol);
    // Orange at half brightness: chroma 0.5 over V 0.5, a quarter of the way to yellow.
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 0.5f, 0.125f, 0), 0.25 / 6, 1, 0.5, tol);
    // Greys have hue and saturation 0.
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 0.3f, 0.3f, 0.3f), 0, 0, 0.3, tol);
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 0, 0, 0), 0, 0, 0, 0);
}

TEST(ColorSpace, HLSOfKnownColours) {
    const double tol = 1e-6;
    ExpectCsTriple(CsToSpace(ColorSpaceType::HLS, 1, 0, 0), 0, 0.5, 1, tol);
    ExpectCsTriple(CsToSpace(ColorSpaceType::HLS, 0, 0, 1), 4.0 / 6, 0.5, 1, tol);
    ExpectCsTriple(CsToSpace(ColorSpaceType::HLS, 1, 1, 1), 0, 1, 0, tol);
    // Pink: L = (0.75 + 0.25) / 2, S = 0.5 / (1 - |2L - 1|).
    ExpectCsTriple(CsToSpace(ColorSpaceType::HLS, 0.75f, 0.25f, 0.25f), 0, 0.5, 0.5, tol);
    // Light cyan above L = 0.5: S = 0.2 / (2 - 2L) with L = 0.9.
    ExpectCsTriple(CsToSpace(ColorSpaceType::HLS, 0.8f, 1.0f, 1.0f), 0.5, 0.9, 0.2 / (2 - 2 * 0.9), tol);
    // Dark green below L = 0.5: S = 0.2 / 2L with L = 0.2.
    ExpectCsTriple(CsToSpace(ColorSpaceType::HLS, 0.1f, 0.3f, 0.1f), 1.0 / 3, 0.2, 0.5, tol);
}

TEST(ColorSpace, LabOfKnownColours) {
    // D65 white is the reference white.
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 1, 1, 1), 100, 0, 0, 1e-4);
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 0, 0, 0), 0, 0, 0, 1e-6);
    // Published CIE L*a*b* (D65) values of the sRGB primaries.
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 1, 0, 0), 53.24, 80.09, 67.20, 0.05);
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 0, 1, 0), 87.73, -86.18, 83.18, 0.05);
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 0, 0, 1), 32.30, 79.19, -107.86, 0.05);
    // Greys: L* = 116 Y^(1/3) - 16 on the cube-root part, 24389/27 * Y on the
    // linear part below Y = (6/29)^3.
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 0.5f, 0.5f, 0.5f), 116 * std::cbrt(0.5) - 16, 0, 0, 1e-4);
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 0.18f, 0.18f, 0.18f), 116 * std::cbrt(0.18f) - 16, 0, 0, 1e-4);
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 0.001f, 0.001f, 0.001f), 24389.0 / 27 * 0.001f, 0, 0, 1e-4);
    // Over-white greys stay grey and go above 100.
    ExpectCsTriple(CsToSpace(ColorSpaceType::LAB, 8, 8, 8), 116 * 2 - 16, 0, 0, 1e-3);
}

TEST(ColorSpace, KnownValuesConvertBack) {
    ExpectCsTriple(CsFromSpace(ColorSpaceType::HSV, 1.0f / 6, 1, 1), 1, 1, 0, 1e-6);
    ExpectCsTriple(CsFromSpace(ColorSpaceType::HSV, 0.5f, 0.5f, 0.8f), 0.4, 0.8, 0.8, 1e-6);
    ExpectCsTriple(CsFromSpace(ColorSpaceType::HLS, 2.0f / 3, 0.5f, 1), 0, 0, 1, 1e-6);
    ExpectCsTriple(CsFromSpace(ColorSpaceType::HLS, 0, 0.75f, 1), 1, 0.5, 0.5, 1e-6);
    ExpectCsTriple(CsFromSpace(ColorSpaceType::LAB, 100, 0, 0), 1, 1, 1, 1e-5);
    ExpectCsTriple(CsFromSpace(ColorSpaceType::LAB, 0, 0, 0), 0, 0, 0, 1e-6);
}

TEST(ColorSpace, HueOutsideOneTurnWraps) {
    for (ColorSpaceType s : {ColorSpaceType::HSV, ColorSpaceType::HLS}) {
        float mid = s == ColorSpaceType::HSV ? 1.0f : 0.5f; // V or L of a full colour
        CsTriple base = CsFromSpace(s, 0.25f, mid, 1);
        CsTriple above = CsFromSpace(s, 1.25f, mid, 1);
        CsTriple below = CsFromSpace(s, -0.75f, mid, 1);
        ExpectCsTriple(above, base.v[0], base.v[1], base.v[2], 1e-6);
        ExpectCsTriple(below, base.v[0], base.v[1], base.v[2], 1e-6);
        // A hue of exactly one turn is red, as is 0.
        ExpectCsTriple(CsFromSpace(s, 1.0f, mid, 1), 1, 0, 0, 1e-6);
    }
}

TEST(ColorSpace, HueStaysBelowOneTurn) {
    // Just short of red through magenta: the hue is a hair under 1 and must
    // not come out as exactly 1.
    for (ColorSpaceType s : {ColorSpaceType::HSV, ColorSpaceType::HLS}) {
        CsTriple h = CsToSpace(s, 1.0f, 0.0f, 1e-9f);
        EXPECT_GE(h.v[0], 0.0f);
        EXPECT_LT(h.v[0], 1.0f);
        CsTriple back = CsFromSpace(s, h.v[0], h.v[1], h.v[2]);
        ExpectCsTriple(back, 1, 0, 0, 1e-6);
    }
}

TEST(ColorSpace, RoundTripsOverGrid) {
    for (ColorSpaceType s : {ColorSpaceType::RGB, ColorSpaceType::HLS, ColorSpaceType::HSV, ColorSpaceType::LAB}) {
        int checked = 0;
        for (float r : kCsGrid)
            for (float g : kCsGrid)
                for (float b : kCsGrid) {
                    float mx = std::max({r, g, b}), mn = std::min({r, g, b});
                    bool chroma = mx > mn;
                    // Colours the space cannot hold (see the header); tested below.
                    if (chroma && s == ColorSpaceType::HSV && mx == 0.0f) continue;
                    if (chroma && s == ColorSpaceType::HLS && (mx + mn == 0.0f || mx + mn == 2.0f)) continue;
                    CsTriple c = CsToSpace(s, r, g, b);
                    if (s == ColorSpaceType::HLS || s == ColorSpaceType::HSV) {
                        EXPECT_GE(c.v[0], 0.0f);
                        EXPECT_LT(c.v[0], 1.0f);
                    }
                    CsTriple back = CsFromSpace(s, c.v[0], c.v[1], c.v[2]);
                    double tol = 2e-6 * std::max(1.0f, std::max(std::fabs(mx), std::fabs(mn)));
                    SCOPED_TRACE(testing::Message()
                                 << "space " << static_cast<int>(s) << " rgb " << r << " " << g << " " << b);
                    ExpectCsTriple(back, r, g, b, tol);
                    ++checked;
                }
        EXPECT_GT(checked, 900);
    }
}

TEST(ColorSpace, RoundTripsInPlace) {
    float px[3] = {0.2f, 0.7f, 1.4f};
    for (ColorSpaceType s : {ColorSpaceType::HLS, ColorSpaceType::HSV, ColorSpaceType::LAB}) {
        RGBToSpace(s, px, px);
        SpaceToRGB(s, px, px);
        EXPECT_NEAR(px[0], 0.2f, 1e-6);
        EXPECT_NEAR(px[1], 0.7f, 1e-6);
        EXPECT_NEAR(px[2], 1.4f, 1e-6);
    }
}

TEST(ColorSpace, ColoursWithoutAFormComeBackGrey) {
    // HSV: largest channel 0 with chroma. V = 0 and S = 0, so black.
    ExpectCsTriple(CsToSpace(ColorSpaceType::HSV, 0, -0.5f, -0.1f), 0, 0, 0, 0);
    // HLS: lightness exactly 0 or 1 with chroma. S = 0, so a grey of that lightness.
    CsTriple dark = CsToSpace(ColorSpaceType::HLS, 0.5f, -0.5f, 0);
    ExpectCsTriple(dark, 0, 0, 0, 0);
    ExpectCsTriple(CsFromSpace(ColorSpaceType::HLS, dark.v[0], dark.v[1], dark.v[2]), 0, 0, 0, 0);
    CsTriple bright = CsToSpace(ColorSpaceType::HLS, 1.5f, 0.5f, 1);
    ExpectCsTriple(bright, 0, 1, 0, 0);
    ExpectCsTriple(CsFromSpace(ColorSpaceType::HLS, bright.v[0], bright.v[1], bright.v[2]), 1, 1, 1, 0);
}

TEST(ColorSpace, RGBAndUnknownSpacesCopy) {
    ExpectCsTriple(CsToSpace(ColorSpaceType::RGB, -1.5f, 0.25f, 7), -1.5, 0.25, 7, 0);
    ExpectCsTriple(CsFromSpace(ColorSpaceType::RGB, -1.5f, 0.25f, 7), -1.5, 0.25, 7, 0);
    ExpectCsTriple(CsToSpace(static_cast<ColorSpaceType>(3), 0.1f, 0.2f, 0.3f), 0.1f, 0.2f, 0.3f, 0);
    ExpectCsTriple(CsFromSpace(static_cast<ColorSpaceType>(42), 0.1f, 0.2f, 0.3f), 0.1f, 0.2f, 0.3f, 0);
}
