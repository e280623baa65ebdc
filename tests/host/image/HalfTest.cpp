#include "host/image/Half.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>

#include "tests/support/CompilerHalf.h"

// The reference is the compiler's own binary16 type, whose conversions round
// to nearest even in the compiler runtime's soft-float routines.
namespace Orvane::halftest {
namespace {

uint32_t FloatBits(float f) {
    uint32_t b;
    std::memcpy(&b, &f, sizeof b);
    return b;
}

float BitsFloat(uint32_t b) {
    float f;
    std::memcpy(&f, &b, sizeof f);
    return f;
}

uint16_t RefToHalf(float f) {
    volatile float in = f; // keep the conversion at run time
    const Test::CompilerHalf h = static_cast<Test::CompilerHalf>(in);
    uint16_t bits;
    std::memcpy(&bits, &h, sizeof bits);
    return bits;
}

float RefToFloat(uint16_t bits) {
    Test::CompilerHalf h;
    std::memcpy(&h, &bits, sizeof h);
    volatile Test::CompilerHalf v = h;
    return static_cast<float>(v);
}

bool IsHalfNaN(uint16_t h) { return (h & 0x7c00u) == 0x7c00u && (h & 0x3ffu) != 0; }

// Compares one conversion with the reference: equal bits, or NaN for NaN with the same sign.
::testing::AssertionResult SameHalf(float f) {
    const uint16_t got = FloatToHalf(f), want = RefToHalf(f);
    if (got == want) return ::testing::AssertionSuccess();
    if (std::isnan(f) && IsHalfNaN(got) && IsHalfNaN(want) && (got & 0x8000u) == (want & 0x8000u))
        return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "float " << f << " (bits 0x" << std::hex << FloatBits(f) << ") gave 0x"
                                         << got << ", expected 0x" << want;
}

TEST(HalfConvert, EveryHalfWidensExactlyAndRoundTrips) {
    int nanCount = 0;
    for (uint32_t i = 0; i < 0x10000u; ++i) {
        const uint16_t h = static_cast<uint16_t>(i);
        const float f = HalfToFloat(h);
        const float want = RefToFloat(h);
        if (IsHalfNaN(h)) {
            ++nanCount;
            ASSERT_TRUE(std::isnan(f)) << std::hex << "half 0x" << i;
            ASSERT_EQ(std::signbit(f), (h & 0x8000u) != 0) << std::hex << "half 0x" << i;
            const uint16_t back = FloatToHalf(f);
            ASSERT_TRUE(IsHalfNaN(back)) << std::hex << "half 0x" << i;
            ASSERT_EQ(back & 0x8000u, h & 0x8000u) << std::hex << "half 0x" << i;
            continue;
        }
        ASSERT_EQ(FloatBits(f), FloatBits(want)) << std::hex << "half 0x" << i;
        ASSERT_EQ(FloatToHalf(f), h) << std::hex << "half 0x" << i;
    }
    EXPECT_EQ(nanCount, 2 * 1023);
}

TEST(HalfConvert, BoundaryCases) {
    struct Case {
        const char *what;
        float in;
        uint16_t out;
    };
    const float min = std::ldexp(1.0f, -24); // the smallest subnormal half
    const Case cases[] = {
        {"zero", 0.0f, 0x0000},
        {"negative zero", -0.0f, 0x8000},
        {"one", 1.0f, 0x3c00},
        {"minus two", -2.0f, 0xc000},
        {"smallest subnormal", min, 0x0001},
        {"minus smallest subnormal", -min, 0x8001},
        {"half the smallest subnormal: tie to zero", min / 2, 0x0000},
        {"just above half the smallest", std::nextafter(min / 2, 1.0f), 0x0001},
        {"just below half the smallest", std::nextafter(min / 2, 0.0f), 0x0000},
        {"one and a half units: tie to two", 1.5f * min, 0x0002},
        {"two and a half units: tie to two", 2.5f * min, 0x0002},
        {"largest subnormal", std::ldexp(1.0f, -14) - min, 0x03ff},
        {"between largest subnormal and smallest normal", std::ldexp(1.0f, -14) - min / 2, 0x0400},
        {"smallest normal", std::ldexp(1.0f, -14), 0x0400},
        {"float min normal", std::numeric_limits<float>::min(), 0x0000},
        {"float subnormal", std::numeric_limits<float>::denorm_min(), 0x0000},
        {"negative float subnormal", -std::numeric_limits<float>::denorm_min(), 0x8000},
        {"1 + 2^-11: tie to even (down)", 1.0f + std::ldexp(1.0f, -11), 0x3c00},
        {"1 + 3 * 2^-11: tie to even (up)", 1.0f + 3 * std::ldexp(1.0f, -11), 0x3c02},
        {"1 + 2^-10", 1.0f + std::ldexp(1.0f, -10), 0x3c01},
        {"2049: tie to 2048", 2049.0f, 0x6800},
        {"2051: tie to 2052", 2051.0f, 0x6802},
        {"0.1", 0.1f, 0x2e66},
        {"1/3", 1.0f / 3.0f, 0x3555},
        {"max half", 65504.0f, 0x7bff},
        {"65519.99 rounds down to the max", 65519.99f, 0x7bff},
        {"65520 rounds to infinity", 65520.0f, 0x7c00},
        {"minus 65520", -65520.0f, 0xfc00},
        {"65536", 65536.0f, 0x7c00},
        {"1e10", 1e10f, 0x7c00},
        {"float max", std::numeric_limits<float>::max(), 0x7c00},
        {"infinity", std::numeric_limits<float>::infinity(), 0x7c00},
        {"minus infinity", -std::numeric_limits<float>::infinity(), 0xfc00},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_EQ(FloatToHalf(c.in), c.out) << std::hex << "0x" << FloatToHalf(c.in);
        EXPECT_EQ(RefToHalf(c.in), c.out) << "the reference disagrees with the table";
    }

    for (float nan : {std::numeric_limits<float>::quiet_NaN(), -std::numeric_limits<float>::quiet_NaN(),
                      std::numeric_limits<float>::signaling_NaN(), BitsFloat(0x7f800001u), BitsFloat(0xffffffffu)}) {
        const uint16_t h = FloatToHalf(nan);
        EXPECT_TRUE(IsHalfNaN(h)) << std::hex << FloatBits(nan);
        EXPECT_EQ((h & 0x8000u) != 0, std::signbit(nan));
        EXPECT_TRUE(SameHalf(nan));
    }
    EXPECT_TRUE(std::isinf(HalfToFloat(0x7c00)));
    EXPECT_TRUE(std::isinf(HalfToFloat(0xfc00)) && HalfToFloat(0xfc00) < 0);
    EXPECT_EQ(HalfToFloat(0x0001), min);
    EXPECT_EQ(HalfToFloat(0x7bff), 65504.0f);
}

TEST(HalfConvert, MidpointsBetweenNeighbours) {
    // For every pair of neighbouring finite halves: the midpoint (a tie) and the
    // floats just beside it.
    for (uint32_t h = 0; h < 0x7c00u; ++h) {
        const double lo = HalfToFloat(static_cast<uint16_t>(h));
        const double hi = h == 0x7bffu ? 65536.0 : static_cast<double>(HalfToFloat(static_cast<uint16_t>(h + 1)));
        const float mid = static_cast<float>((lo + hi) / 2); // exact: 12 significant bits
        ASSERT_EQ(static_cast<double>(mid), (lo + hi) / 2);
        for (float f : {mid, std::nextafter(mid, 0.0f), std::nextafter(mid, 1e30f)}) {
            ASSERT_TRUE(SameHalf(f));
            ASSERT_TRUE(SameHalf(-f));
        }
    }
}

TEST(HalfConvert, PseudoRandomFloatsMatchTheReference) {
    uint64_t state = 0x9e3779b97f4a7c15ull;
    auto next = [&state] { // splitmix64
        uint64_t z = (state += 0x9e3779b97f4a7c15ull);
        z = (z ^ (z >> 30)) * 0xbf58476d1ce4e5b9ull;
        z = (z ^ (z >> 27)) * 0x94d049bb133111ebull;
        return z ^ (z >> 31);
    };
    int mismatches = 0;
    for (int i = 0; i < 2000000; ++i) {
        const uint64_t r = next();
        // Any bit pattern at all, and one whose exponent lies in or near the half range.
        const float any = BitsFloat(static_cast<uint32_t>(r));
        const uint32_t exp = 96 + static_cast<uint32_t>((r >> 32) % 50); // 2^-31 .. 2^18
        const float near = BitsFloat(static_cast<uint32_t>((r >> 63) << 31) | (exp << 23) |
                                     static_cast<uint32_t>((r >> 40) & 0x7fffffu));
        for (float f : {any, near}) {
            const ::testing::AssertionResult same = SameHalf(f);
            if (!same && ++mismatches <= 10) ADD_FAILURE() << same.message();
        }
    }
    EXPECT_EQ(mismatches, 0);
}

} // namespace
} // namespace Orvane::halftest
