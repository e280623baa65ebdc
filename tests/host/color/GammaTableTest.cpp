#include "host/color/GammaTable.h"

#include <cfloat>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <vector>

#include <gtest/gtest.h>

using namespace Orvane;

namespace {

// Inputs in [0, 1] for the sweeps: a uniform grid 64 points to a table step,
// and float bit patterns from the smallest subnormal up to 1 at a stride, so
// tiny values, where the curve is computed directly, are covered too.
std::vector<float> GammaSweepInputs() {
    std::vector<float> xs;
    const int n = 1 << 18;
    for (int k = 0; k <= n; ++k) xs.push_back(static_cast<float>(k) / n);
    for (uint32_t bits = 1; bits <= 0x3f800000u; bits += 4099) {
        float x;
        std::memcpy(&x, &bits, sizeof x);
        xs.push_back(x);
    }
    xs.push_back(std::nextafter(1.0f, 0.0f));
    return xs;
}

// Stated accuracy on [0, 1]: the table tolerance times |scale|, plus a few
// float roundings of the result.
double GammaTolerance(double scale, double expected) {
    return GammaTable::kFloatTolerance * std::fabs(scale) + 4 * FLT_EPSILON * std::fabs(expected);
}

} // namespace

TEST(GammaTable, FloatCurveMatchesPowOverDenseSweep) {
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
}

TEST(GammaTable, FloatCurveIsMonotoneForIncreasingPowers) {
    const std::vector<float> xs = [] {
        std::vector<float> v;
        for (int k = 0; k <= 1 << 18; ++k) v.push_back(static_cast<float>(k) / (1 << 18));
        return v;
    }();
    for (double e : {0.1, 1 / 2.2, 2.2, 100.0, 1e5}) {
        GammaTable t;
        t.InitTableFlt(nullptr, 1.0, e);
        float prev = t.LookupFlt(xs[0]);
        for (float x : xs) {
            float y = t.LookupFlt(x);
            ASSERT_GE(y, prev) << "exponent " << e << " at x = " << x;
            prev = y;
        }
    }
}

TEST(GammaTable, FloatCurveOutsideZeroToOne) {
    GammaTable t;
    t.InitTableFlt(nullptr, 1.0, 2.2);
    // Below 0 and NaN read as 0.
    EXPECT_EQ(t.LookupFlt(-0.5f), 0.0f);
    EXPECT_EQ(t.LookupFlt(-1e30f), 0.0f);
    EXPECT_EQ(t.LookupFlt(-std::numeric_limits<float>::infinity()), 0.0f);
    EXPECT_EQ(t.LookupFlt(std::numeric_limits<float>::quiet_NaN()), 0.0f);
    // Above 1 the true power.
    for (float x : {1.0000001f, 1.5f, 2.0f, 16.0f, 1000.0f}) {
        double expected = std::pow(static_cast<double>(x), 2.2);
        EXPECT_NEAR(t.LookupFlt(x), expected, expected * 2 * FLT_EPSILON) << x;
    }
    // Past the float range the result is held at the largest float.
    EXPECT_EQ(t.LookupFlt(1e30f), FLT_MAX);
    EXPECT_EQ(t.LookupFlt(std::numeric_limits<float>::infinity()), FLT_MAX);

    GammaTable neg;
    neg.InitTableFlt(nullptr, -2.0, 2.0);
    EXPECT_NEAR(neg.LookupFlt(0.25f), -0.125, 1e-6);
    EXPECT_NEAR(neg.LookupFlt(3.0f), -18.0, 1e-5);
    EXPECT_EQ(neg.LookupFlt(1e30f), -FLT_MAX);
}

TEST(GammaTable, ExponentOneIsExactIdentity) {
    GammaTable t;
    t.InitTableFlt(nullptr, 1.0, 1.0);
    for (int k = 0; k <= 1 << 24; ++k) {
        float x = static_cast<float>(k) / (1 << 24);
        ASSERT_EQ(t.LookupFlt(x), x);
    }
    for (uint32_t bits = 0; bits < 0x7f800000u; bits += 8191) { // every float magnitude, 0 to FLT_MAX
        float x;
        std::memcpy(&x, &bits, sizeof x);
        ASSERT_EQ(t.LookupFlt(x), x) << bits;
    }
    EXPECT_EQ(t.LookupFlt(FLT_MAX), FLT_MAX);

    GammaTable t16;
    t16.InitTable(nullptr, 1.0);
    for (int v = 0; v < 65536; ++v) ASSERT_EQ(t16.Lookup(static_cast<uint16_t>(v)), v);
}

TEST(GammaTable, HugeExponents) {
    for (double e : {1e5, std::numeric_limits<double>::infinity()}) {
        SCOPED_TRACE(e);
        GammaTable t;
        t.InitTableFlt(nullptr, 1.0, e);
        EXPECT_EQ(t.LookupFlt(1.0f), 1.0f);
        EXPECT_EQ(t.LookupFlt(0.0f), 0.0f);
        for (int k = 0; k <= 1 << 20; ++k) {
            float x = static_cast<float>(k) / (1 << 20);
            float y = t.LookupFlt(x);
            ASSERT_TRUE(y >= 0.0f && y <= 1.0f) << x;
            // x^100000 is below the smallest float for x <= 0.998 (e^-200).
            if (x <= 0.998f) {
                ASSERT_EQ(y, 0.0f) << x;
            }
        }
        GammaTable t16;
        t16.InitTable(nullptr, e);
        EXPECT_EQ(t16.Lookup(65535), 65535);
        // (65400 / 65535)^100000 is about e^-206: rounds to 0, as does all below.
        for (int v = 0; v <= 65400; ++v) ASSERT_EQ(t16.Lookup(static_cast<uint16_t>(v)), 0) << v;
    }
    // Right under 1 the power is still the true one: (1 - 2^-24)^100000 is
    // e^(-100000 * 2^-24) to well within float precision.
    GammaTable t;
    t.InitTableFlt(nullptr, 1.0, 1e5);
    EXPECT_NEAR(t.LookupFlt(std::nextafter(1.0f, 0.0f)), std::exp(-1e5 / 16777216.0), 1e-6);
    EXPECT_EQ(t.LookupFlt(std::nextafter(1.0f, 2.0f)), static_cast<float>(std::pow(1.0 + 1.0 / (1 << 23), 1e5)));
}

TEST(GammaTable, ExponentZeroIsOneEverywhere) {
    GammaTable t;
    t.InitTableFlt(nullptr, 3.0, 0.0);
    for (float x : {0.0f, 1e-30f, 0.25f, 1.0f, 7.0f}) EXPECT_EQ(t.LookupFlt(x), 3.0f) << x; // 0^0 = 1
    EXPECT_EQ(t.LookupFlt(-1.0f), 3.0f);                                                    // reads as 0
    GammaTable t16;
    t16.InitTable(nullptr, 0.0);
    for (int v : {0, 1, 32768, 65535}) EXPECT_EQ(t16.Lookup(static_cast<uint16_t>(v)), 65535) << v;
}

TEST(GammaTable, NegativeAndNaNExponents) {
    // Negative: taken as 0.
    GammaTable neg;
    neg.InitTableFlt(nullptr, 1.0, -2.0);
    EXPECT_EQ(neg.LookupFlt(0.0f), 1.0f);
    EXPECT_EQ(neg.LookupFlt(0.5f), 1.0f);
    GammaTable neg16;
    neg16.InitTable(nullptr, -2.0);
    EXPECT_EQ(neg16.Lookup(0), 65535);
    // NaN: taken as 1.
    GammaTable nan;
    nan.InitTableFlt(nullptr, 1.0, std::nan(""));
    EXPECT_EQ(nan.LookupFlt(0.3f), 0.3f);
    EXPECT_EQ(nan.LookupFlt(5.0f), 5.0f);
    GammaTable nan16;
    nan16.InitTable(nullptr, std::nan(""));
    EXPECT_EQ(nan16.Lookup(12345), 12345);
}

TEST(GammaTable, SixteenBitMatchesIntegerClosedForms) {
    // Exponent 2: round(v^2 / 65535), in integers (no ties: 65535 is odd).
    GammaTable sq;
    sq.InitTable(nullptr, 2.0);
    for (uint64_t v = 0; v < 65536; ++v)
        ASSERT_EQ(sq.Lookup(static_cast<uint16_t>(v)), (2 * v * v + 65535) / (2 * 65535)) << v;
    // Exponent 1/2: round(sqrt(v * 65535)): r = floor(sqrt(n)), plus one when
    // (r + 1/2)^2 <= n, i.e. 4r^2 + 4r + 1 <= 4n.
    GammaTable rt;
    rt.InitTable(nullptr, 0.5);
    for (uint64_t v = 0; v < 65536; ++v) {
        uint64_t n = v * 65535;
        uint64_t r = static_cast<uint64_t>(std::sqrt(static_cast<double>(n)));
        while (r * r > n) --r;
        while ((r + 1) * (r + 1) <= n) ++r;
        uint64_t expected = r + (4 * r * r + 4 * r + 1 <= 4 * n ? 1 : 0);
        ASSERT_EQ(rt.Lookup(static_cast<uint16_t>(v)), expected) << v;
    }
}

TEST(GammaTable, LookupsBeforeInitAreIdentity) {
    GammaTable t;
    EXPECT_EQ(t.LookupFlt(0.375f), 0.375f);
    EXPECT_EQ(t.LookupFlt(4.0f), 4.0f);
    EXPECT_EQ(t.LookupFlt(-1.0f), 0.0f);
    EXPECT_EQ(t.Lookup(4321), 4321);
}

TEST(GammaTable, RebuildingReplacesTheCurve) {
    GammaTable t;
    t.InitTableFlt(nullptr, 1.0, 1e5); // table serves only part of [0, 1]
    t.InitTableFlt(nullptr, 1.0, 0.5); // a different part
    for (float x : {1e-6f, 0.001f, 0.3f, 0.999f, 1.0f}) EXPECT_NEAR(t.LookupFlt(x), std::sqrt(x), 2e-6) << x;
    t.InitTable(nullptr, 2.0);
    t.InitTable(nullptr, 1.0);
    EXPECT_EQ(t.Lookup(30000), 30000);
}
