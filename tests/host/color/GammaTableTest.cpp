// Gamma tables against std::pow in double over dense sweeps, integer closed forms, degenerate exponents.
#include "host/color/GammaTable.h"

#include <bit>
#include <cfloat>
#include <cmath>
#include <limits>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

using namespace Orvane;

namespace {

// Inputs in [0, 1]: a grid of 64 points to a table step, and floats from the smallest subnormal to 1 at a stride.
std::vector<float> GammaSweepInputs() {
    std::vector<float> xs;
    const int n = 1 << 18;
    for (int k = 0; k <= n; ++k) xs.push_back(static_cast<float>(k) / n);
    for (uint32_t bits = 1; bits <= 0x3f800000u; bits += 4099) xs.push_back(std::bit_cast<float>(bits));
    xs.push_back(std::nextafter(1.0f, 0.0f));
    return xs;
}

// Stated accuracy on [0, 1]: the table tolerance times |scale|, plus a few float roundings.
double GammaTolerance(double scale, double expected) {
    return GammaTable::kFloatTolerance * std::fabs(scale) + 4 * FLT_EPSILON * std::fabs(expected);
}

} // namespace

TEST(GammaTable, FloatCurveMatchesPowOverDenseSweepAndRises) {
    const std::vector<float> xs = GammaSweepInputs();
    for (double scale : {1.0, 2.5}) {
        for (double e : {0.1, 1 / 2.4, 1 / 2.2, 0.5, 1 / 1.8, 0.9, 1.5, 1.8, 2.2, 2.4, 3.0, 10.0, 100.0}) {
            GammaTable t;
            t.InitTableFlt(nullptr, scale, e);
            double worst = 0.0;
            float worstX = 0.0f;
            for (float x : xs) {
                double expected = scale * std::pow(static_cast<double>(x), e);
                double err = std::fabs(t.LookupFlt(x) - expected) - GammaTolerance(scale, expected);
                if (err > worst) worst = err, worstX = x;
            }
            EXPECT_LE(worst, 0.0) << "exponent " << e << " scale " << scale << " at x = " << worstX;
        }
    }
    for (double e : {0.1, 1 / 2.2, 2.2, 100.0, 1e5}) {
        GammaTable t;
        t.InitTableFlt(nullptr, 1.0, e);
        for (int k = 1; k <= 1 << 18; ++k) {
            const float x = static_cast<float>(k) / (1 << 18), before = static_cast<float>(k - 1) / (1 << 18);
            ASSERT_GE(t.LookupFlt(x), t.LookupFlt(before)) << "exponent " << e << " at x = " << x;
        }
    }
}

TEST(GammaTable, FloatCurveOutsideZeroToOneAndExponentOneIsExactIdentity) {
    GammaTable t, neg;
    t.InitTableFlt(nullptr, 1.0, 2.2);
    neg.InitTableFlt(nullptr, -2.0, 2.0);
    // Below 0 and NaN read as 0; past the float range the result is held at the largest float.
    for (float x : {-0.5f, -1e30f, -std::numeric_limits<float>::infinity(), std::numeric_limits<float>::quiet_NaN()})
        EXPECT_EQ(t.LookupFlt(x), 0.0f) << x;
    EXPECT_TRUE(t.LookupFlt(1e30f) == FLT_MAX && t.LookupFlt(std::numeric_limits<float>::infinity()) == FLT_MAX &&
                neg.LookupFlt(1e30f) == -FLT_MAX);
    // Above 1 the true power, scale included.
    for (float x : {1.0000001f, 1.5f, 2.0f, 16.0f, 1000.0f}) {
        const double expected = std::pow(static_cast<double>(x), 2.2);
        EXPECT_NEAR(t.LookupFlt(x), expected, expected * 2 * FLT_EPSILON) << x;
    }
    EXPECT_NEAR(neg.LookupFlt(0.25f), -0.125, 1e-6);
    EXPECT_NEAR(neg.LookupFlt(3.0f), -18.0, 1e-5);
    // Exponent one is the exact identity.
    GammaTable identity, t16;
    identity.InitTableFlt(nullptr, 1.0, 1.0);
    t16.InitTable(nullptr, 1.0);
    for (int k = 0; k <= 1 << 24; ++k)
        ASSERT_EQ(identity.LookupFlt(static_cast<float>(k) / (1 << 24)), k / 16777216.0f);
    for (uint32_t bits = 0; bits < 0x7f800000u; bits += 8191) { // every float magnitude, 0 to FLT_MAX
        const float x = std::bit_cast<float>(bits);
        ASSERT_EQ(identity.LookupFlt(x), x) << bits;
    }
    EXPECT_EQ(identity.LookupFlt(FLT_MAX), FLT_MAX);
    for (int v = 0; v < 65536; ++v) ASSERT_EQ(t16.Lookup(static_cast<uint16_t>(v)), v);
}

TEST(GammaTable, DegenerateExponentsTablesNotYetBuiltSixteenBitClosedFormsAndRebuilding) {
    const double inf = std::numeric_limits<double>::infinity(), nan = std::nan("");
    // Exponent 0 is 1 everywhere (0^0 = 1); a negative one is taken as 0, NaN as 1; a huge one is 0 below 1.
    const std::tuple<double, double, float, float> floats[] = {
        {3, 0, 0, 3},         {3, 0, 1e-30f, 3}, {3, 0, 7, 3},   {3, 0, -1, 3},  {1, -2, 0, 1},  {1, -2, 0.5f, 1},
        {1, nan, 0.3f, 0.3f}, {1, nan, 5, 5},    {1, 1e5, 1, 1}, {1, 1e5, 0, 0}, {1, inf, 1, 1}, {1, inf, 0.5f, 0}};
    for (const auto &[scale, exponent, x, want] : floats) {
        GammaTable t;
        t.InitTableFlt(nullptr, scale, exponent);
        EXPECT_EQ(t.LookupFlt(x), want) << "exponent " << exponent << " at " << x;
    }
    const std::tuple<double, uint16_t, uint16_t> shorts[] = {
        {0, 0, 65535}, {0, 32768, 65535}, {-2, 0, 65535}, {nan, 12345, 12345}, {1e5, 65535, 65535}};
    for (const auto &[exponent, v, want] : shorts) {
        GammaTable t;
        t.InitTable(nullptr, exponent);
        EXPECT_EQ(t.Lookup(v), want) << "exponent " << exponent << " at " << v;
    }
    for (double e : {1e5, inf}) {
        GammaTable t, t16;
        t.InitTableFlt(nullptr, 1.0, e);
        t16.InitTable(nullptr, e);
        // x^100000 is below the smallest float for x <= 0.998 (e^-200); (65400 / 65535)^100000 is about e^-206.
        for (int k = 0; k <= 1 << 20; ++k) {
            const float x = static_cast<float>(k) / (1 << 20), y = t.LookupFlt(x);
            ASSERT_TRUE(y >= 0.0f && y <= 1.0f && (x > 0.998f || y == 0.0f)) << x;
        }
        for (int v = 0; v <= 65400; ++v) ASSERT_EQ(t16.Lookup(static_cast<uint16_t>(v)), 0) << v;
    }
    // Right under 1 the power is still the true one: (1 - 2^-24)^100000 is e^(-100000 * 2^-24).
    GammaTable t;
    t.InitTableFlt(nullptr, 1.0, 1e5);
    EXPECT_NEAR(t.LookupFlt(std::nextafter(1.0f, 0.0f)), std::exp(-1e5 / 16777216.0), 1e-6);
    EXPECT_EQ(t.LookupFlt(std::nextafter(1.0f, 2.0f)), static_cast<float>(std::pow(1.0 + 1.0 / (1 << 23), 1e5)));
    // Lookups before the matching Init are the identity (floats still read below 0 as 0).
    GammaTable fresh;
    EXPECT_TRUE(fresh.LookupFlt(0.375f) == 0.375f && fresh.LookupFlt(4.0f) == 4.0f && fresh.LookupFlt(-1.0f) == 0.0f &&
                fresh.Lookup(4321) == 4321);
    // Exponent 2: round(v^2 / 65535) (no ties: 65535 is odd). Exponent 1/2: round(sqrt(v * 65535)), that is
    // r = floor(sqrt(n)), plus one when (r + 1/2)^2 <= n, i.e. 4r^2 + 4r + 1 <= 4n.
    GammaTable sq, rt;
    sq.InitTable(nullptr, 2.0);
    rt.InitTable(nullptr, 0.5);
    for (uint64_t v = 0; v < 65536; ++v) {
        ASSERT_EQ(sq.Lookup(static_cast<uint16_t>(v)), (2 * v * v + 65535) / (2 * 65535)) << v;
        const uint64_t n = v * 65535;
        uint64_t r = static_cast<uint64_t>(std::sqrt(static_cast<double>(n)));
        while (r * r > n) --r;
        while ((r + 1) * (r + 1) <= n) ++r;
        ASSERT_EQ(rt.Lookup(static_cast<uint16_t>(v)), r + (4 * r * r + 4 * r + 1 <= 4 * n ? 1 : 0)) << v;
    }
    GammaTable rebuilt;
    rebuilt.InitTableFlt(nullptr, 1.0, 1e5); // table serves only part of [0, 1]
    rebuilt.InitTableFlt(nullptr, 1.0, 0.5); // a different part
    for (float x : {1e-6f, 0.001f, 0.3f, 0.999f, 1.0f}) EXPECT_NEAR(rebuilt.LookupFlt(x), std::sqrt(x), 2e-6) << x;
    rebuilt.InitTable(nullptr, 2.0);
    rebuilt.InitTable(nullptr, 1.0);
    EXPECT_EQ(rebuilt.Lookup(30000), 30000);
}
