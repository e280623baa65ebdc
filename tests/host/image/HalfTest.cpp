#include "host/image/Half.h"

#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <cstdint>
#include <limits>

#include "tests/support/CompilerHalf.h"

// The reference is the compiler's own binary16 type, whose conversions round
// to nearest even in the compiler runtime's soft-float routines.
namespace Orvane::halftest {
namespace {

uint32_t FloatBits(float f) { return std::bit_cast<uint32_t>(f); }
float BitsFloat(uint32_t b) { return std::bit_cast<float>(b); }

uint16_t RefToHalf(float f) {
    volatile float in = f; // keep the conversion at run time
    return std::bit_cast<uint16_t>(static_cast<Orvane::Test::CompilerHalf>(in));
}

bool IsHalfNaN(uint16_t h) { return (h & 0x7c00u) == 0x7c00u && (h & 0x3ffu) != 0; }

// Compares one conversion with the reference: equal bits, or NaN for NaN with the same sign.
::testing::AssertionResult SameHalf(float f) {
    const uint16_t got = FloatToHalf(f), want = RefToHalf(f);
    if (got == want || (IsHalfNaN(got) && IsHalfNaN(want) && (got & 0x8000u) == (want & 0x8000u)))
        return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "float " << f << " (bits 0x" << std::hex << FloatBits(f) << ") gave 0x"
                                         << got << ", expected 0x" << want;
}

TEST(HalfConvert, EveryHalfWidensExactlyAndRoundTrips) {
    int nanCount = 0;
    for (uint32_t i = 0; i < 0x10000u; ++i) {
        const uint16_t h = static_cast<uint16_t>(i);
        const float f = HalfToFloat(h);
        volatile Orvane::Test::CompilerHalf ref = std::bit_cast<Orvane::Test::CompilerHalf>(h);
        if (IsHalfNaN(h)) { // NaN, with its sign, both ways
            ++nanCount;
            ASSERT_TRUE(std::isnan(f) && std::signbit(f) == ((h & 0x8000u) != 0)) << std::hex << "half 0x" << i;
            ASSERT_TRUE(SameHalf(f)) << std::hex << "half 0x" << i;
            continue;
        }
        ASSERT_EQ(FloatBits(f), FloatBits(static_cast<float>(ref))) << std::hex << "half 0x" << i;
        ASSERT_EQ(FloatToHalf(f), h) << std::hex << "half 0x" << i;
    }
    EXPECT_EQ(nanCount, 2 * 1023);
}

TEST(HalfConvert, BoundaryCases) {
    // The table holds the reference to account as well.
    const float min = std::ldexp(1.0f, -24); // the smallest subnormal half
    const struct {
        const char *what;
        float in;
        uint16_t out;
    } cases[] = {
        {"negative zero", -0.0f, 0x8000},
        {"minus smallest subnormal", -min, 0x8001},
        {"half the smallest subnormal: tie to zero", min / 2, 0x0000},
        {"just above half the smallest", std::nextafter(min / 2, 1.0f), 0x0001},
        {"two and a half units: tie to two", 2.5f * min, 0x0002},
        {"between largest subnormal and smallest normal", std::ldexp(1.0f, -14) - min / 2, 0x0400},
        {"float min normal", std::numeric_limits<float>::min(), 0x0000},
        {"1 + 2^-11: tie to even (down)", 1.0f + std::ldexp(1.0f, -11), 0x3c00},
        {"1 + 3 * 2^-11: tie to even (up)", 1.0f + 3 * std::ldexp(1.0f, -11), 0x3c02},
        {"1/3", 1.0f / 3.0f, 0x3555},
        {"65519.99 rounds down to the max", 65519.99f, 0x7bff},
        {"65520 rounds to infinity", 65520.0f, 0x7c00},
        {"float max", std::numeric_limits<float>::max(), 0x7c00},
        {"minus infinity", -std::numeric_limits<float>::infinity(), 0xfc00},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(FloatToHalf(c.in), c.out) << c.what;
        EXPECT_EQ(RefToHalf(c.in), c.out) << c.what << ": the reference disagrees with the table";
    }
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
    int mismatches = 0;
    for (int i = 0; i < 2000000; ++i) {
        uint64_t r = (state += 0x9e3779b97f4a7c15ull); // splitmix64
        r = (r ^ (r >> 30)) * 0xbf58476d1ce4e5b9ull;
        r = (r ^ (r >> 27)) * 0x94d049bb133111ebull;
        r ^= r >> 31;
        // Any bit pattern at all (NaNs included), and one whose exponent lies in or near the half range.
        const uint32_t exp = 96 + static_cast<uint32_t>((r >> 32) % 50); // 2^-31 .. 2^18
        const uint32_t near = static_cast<uint32_t>((r >> 63) << 31) | (exp << 23) | ((r >> 40) & 0x7fffffu);
        for (uint32_t bits : {static_cast<uint32_t>(r), near}) {
            const ::testing::AssertionResult same = SameHalf(BitsFloat(bits));
            if (!same && ++mismatches <= 10) ADD_FAILURE() << same.message();
        }
    }
    EXPECT_EQ(mismatches, 0);
}

} // namespace
} // namespace Orvane::halftest
