// Transfer curves: published values, the Cineon code points, continuity where
// the pieces meet, monotony, mirroring, and round trips of every pair.
#include "host/color/Gamut.h"

#include <gtest/gtest.h>

#include <cmath>
#include <tuple>
#include <vector>

namespace Orvane::gamuttest {
namespace {

const GamutSpace kCurves[] = {GamutSpace::SRGB, GamutSpace::Rec709, GamutSpace::Gamma, GamutSpace::CineonLog};

GamutCurve Curve(GamutSpace s, double gamma = 2.2, double soft = 0.0) {
    GamutCurve c;
    c.space = s;
    c.gamma = gamma;
    c.log.softClip = soft;
    return c;
}

TEST(Gamut, KnownValuesPiecesMeetCurvesRiseMirrorAndRoundTripAndRowsMatchTheScalars) {
    const CineonLogParams log;
    CineonLogParams full;
    full.black = 0, full.white = 1023, full.filmGamma = 1.0;
    // Each 0.002 x 300 / 0.6 = 1 decade below white: linear 0.1 plus the black offset's share.
    const double offset = std::pow(10.0, -590 * 0.002 / 0.6);
    const std::tuple<const char *, double, double, double> cases[] = {
        {"sRGB 0.5", SRGBToLinear(0.5), 0.214041, 1e-6},
        {"sRGB linear part", SRGBToLinear(0.04045), 0.04045 / 12.92, 1e-12},
        {"sRGB white", SRGBToLinear(1.0), 1.0, 0},
        // BT.709: 4.5 L near black; above, 1.099 L^0.45 - 0.099 (to the rounding of those constants).
        {"709 near black", LinearToRec709(0.01), 0.045, 1e-12},
        {"709 grey", LinearToRec709(0.18), 1.099 * std::pow(0.18, 0.45) - 0.099, 3e-4},
        {"709 white", Rec709ToLinear(1.0), 1.0, 1e-12},
        {"gamma", GammaToLinear(0.5, 2.2), std::pow(0.5, 2.2), 1e-12},
        {"Cineon white 685", CineonToLinear(685.0 / 1023, log), 1.0, 1e-12},
        {"Cineon black 95", CineonToLinear(95.0 / 1023, log), 0.0, 1e-12},
        {"Cineon a decade down", CineonToLinear(385.0 / 1023, log), (0.1 - offset) / (1 - offset), 1e-12},
        {"18% grey", LinearToCineon(0.18, log) * 1023, 685 + std::log10(0.18 * (1 - offset) + offset) * 300, 1e-9},
        {"18% grey near code 468", LinearToCineon(0.18, log) * 1023, 468, 1.0},
        {"full range white", CineonToLinear(1.0, full), 1.0, 1e-12},
        {"full range black", CineonToLinear(0.0, full), 0.0, 1e-12},
    };
    for (const auto &[what, got, want, tol] : cases) EXPECT_NEAR(got, want, tol) << what;
    const double eps = 1e-9, h = 1e-5, black = 95.0 / 1023;
    // Where the pieces meet, the two sides agree, and so do their slopes at the Cineon black.
    EXPECT_NEAR(LinearToRec709(0.018053968510807 - eps), LinearToRec709(0.018053968510807 + eps), 1e-7);
    EXPECT_NEAR(LinearToSRGB(0.0031308 - eps), LinearToSRGB(0.0031308 + eps), 1e-6);
    EXPECT_NEAR(CineonToLinear(black - eps, log), CineonToLinear(black + eps, log), 1e-7);
    const double below = (CineonToLinear(black, log) - CineonToLinear(black - h, log)) / h;
    const double above = (CineonToLinear(black + h, log) - CineonToLinear(black, log)) / h;
    EXPECT_NEAR(below, above, 1e-3 * above);
    for (GamutSpace s : kCurves)
        for (double soft : {0.0, 80.0}) {
            const GamutCurve c = Curve(s, 2.2, soft);
            double prevIn = GamutToLinear(c, -0.5), prevOut = GamutFromLinear(c, -0.5);
            // With a soft clip the curves flatten toward white: checked below it.
            for (double v = -0.5 + 1e-3; v < (soft > 0 ? 0.9 : 3.0); v += 1e-3) {
                const double in = GamutToLinear(c, v), out = GamutFromLinear(c, v);
                ASSERT_TRUE(in > prevIn && out > prevOut) << static_cast<int>(s) << " at " << v;
                prevIn = in, prevOut = out;
            }
            // The display curves mirror about zero.
            if (s == GamutSpace::CineonLog) continue;
            for (double v : {0.001, 0.3, 2.5})
                EXPECT_TRUE(GamutToLinear(c, -v) == -GamutToLinear(c, v) &&
                            GamutFromLinear(c, -v) == -GamutFromLinear(c, v))
                    << static_cast<int>(s) << " at " << v;
        }
    // A soft clip rolls highlights off under white and leaves the mid-tones.
    const GamutCurve soft = Curve(GamutSpace::CineonLog, 2.2, 80.0);
    EXPECT_LT(GamutToLinear(soft, 1.0), 1.0);
    EXPECT_LT(GamutToLinear(soft, 650.0 / 1023), CineonToLinear(650.0 / 1023, log));
    EXPECT_EQ(GamutToLinear(soft, 500.0 / 1023), CineonToLinear(500.0 / 1023, log));
    // Pairs round trip.
    for (GamutSpace s : kCurves)
        for (double gamma : {0.45, 2.2})
            for (double soft : {0.0, 40.0}) {
                const GamutCurve c = Curve(s, gamma, soft);
                // A soft clip keeps linear values under 1: round trips hold below that.
                const double top = s == GamutSpace::CineonLog && soft > 0 ? 0.9 : 2.0;
                for (double v = -0.25; v <= top; v += 1.0 / 512) {
                    const double tol = 1e-6 * std::max(1.0, std::fabs(v));
                    ASSERT_NEAR(GamutToLinear(c, GamutFromLinear(c, v)), v, tol) << static_cast<int>(s) << " " << gamma;
                    ASSERT_NEAR(GamutFromLinear(c, GamutToLinear(c, v)), v, tol) << static_cast<int>(s) << " " << soft;
                }
            }
    EXPECT_TRUE(Curve(GamutSpace::NoChange).IsIdentity() && Curve(GamutSpace::Linear).IsIdentity() &&
                Curve(GamutSpace::Gamma, 1.0).IsIdentity() && !Curve(GamutSpace::SRGB).IsIdentity());
    EXPECT_EQ(GamutToLinear(Curve(GamutSpace::Linear), 0.37), 0.37);
    // Rows give the scalars and leave alpha.
    for (GamutSpace s : kCurves) {
        const GamutCurve c = Curve(s, 1.8);
        std::vector<float> px;
        for (int i = 0; i < 40; ++i) px.insert(px.end(), {i / 20.f - 0.3f, i / 37.f, 1.f - i / 30.f, 0.5f + i / 80.f});
        std::vector<float> lin = px, enc = px;
        GamutRowToLinear(c, lin.data(), 40);
        GamutRowFromLinear(c, enc.data(), 40);
        for (size_t k = 0; k < px.size(); ++k) {
            const bool alpha = k % 4 == 3;
            EXPECT_EQ(lin[k], alpha ? px[k] : static_cast<float>(GamutToLinear(c, px[k]))) << k;
            EXPECT_EQ(enc[k], alpha ? px[k] : static_cast<float>(GamutFromLinear(c, px[k]))) << k;
        }
    }
}

} // namespace
} // namespace Orvane::gamuttest
