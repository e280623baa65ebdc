// Half conversions against the compiler's binary16 type (round to nearest even in the runtime's soft-float
// routines): every half, every tie between neighbours, floats at a stride.
#include "host/image/Half.h"

#include <bit>

#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::halftest {
namespace {
using Half16 = ::Orvane::Test::CompilerHalf;

uint16_t RefToHalf(float f) {
    volatile float in = f; // keep the conversion at run time
    return std::bit_cast<uint16_t>(static_cast<Half16>(in));
}

bool IsHalfNaN(uint16_t h) { return (h & 0x7c00u) == 0x7c00u && (h & 0x3ffu) != 0; }

// Compares one conversion with the reference: equal bits, or NaN for NaN with the same sign.
::testing::AssertionResult SameHalf(float f) {
    const uint16_t got = FloatToHalf(f), want = RefToHalf(f);
    if (got == want || (IsHalfNaN(got) && IsHalfNaN(want) && (got & 0x8000u) == (want & 0x8000u)))
        return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "float " << f << " (bits 0x" << std::hex << std::bit_cast<uint32_t>(f)
                                         << ") gave 0x" << got << ", expected 0x" << want;
}

TEST(HalfConvert, EveryHalfRoundTripsEveryTieAndFloatsAtAStrideRoundAsTheCompiler) {
    int nanCount = 0;
    for (uint32_t i = 0; i < 0x10000u; ++i) {
        const uint16_t h = static_cast<uint16_t>(i);
        const float f = HalfToFloat(h);
        const float ref = ::Orvane::Test::CompilerHalfToFloat(h);
        if (IsHalfNaN(h)) { // NaN, with its sign, both ways
            ++nanCount;
            ASSERT_TRUE(std::isnan(f) && std::signbit(f) == ((h & 0x8000u) != 0) && SameHalf(f)) << std::hex << i;
            continue;
        }
        ASSERT_EQ(std::bit_cast<uint32_t>(f), std::bit_cast<uint32_t>(ref)) << std::hex << i;
        ASSERT_EQ(FloatToHalf(f), h) << std::hex << "half 0x" << i;
    }
    EXPECT_EQ(nanCount, 2 * 1023);
    // For every pair of neighbouring finite halves: the midpoint (a tie) and
    // the floats just beside it, both signs.
    for (uint32_t h = 0; h < 0x7c00u; ++h) {
        const double lo = HalfToFloat(static_cast<uint16_t>(h));
        const double hi = h == 0x7bffu ? 65536.0 : static_cast<double>(HalfToFloat(static_cast<uint16_t>(h + 1)));
        const float mid = static_cast<float>((lo + hi) / 2); // exact: 12 significant bits
        ASSERT_EQ(static_cast<double>(mid), (lo + hi) / 2);
        for (float f : {mid, std::nextafter(mid, 0.0f), std::nextafter(mid, 1e30f)})
            ASSERT_TRUE(SameHalf(f) && SameHalf(-f));
    }
    // Float bit patterns at a stride: every exponent, NaNs with payloads, overflow and underflow.
    int mismatches = 0;
    for (uint64_t bits = 0; bits < (1ull << 32); bits += 997) {
        const ::testing::AssertionResult same = SameHalf(std::bit_cast<float>(static_cast<uint32_t>(bits)));
        if (!same && ++mismatches <= 10) ADD_FAILURE() << same.message();
    }
    EXPECT_EQ(mismatches, 0);
}

} // namespace
} // namespace Orvane::halftest
