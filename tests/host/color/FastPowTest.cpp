// PowAbsSigned against std::pow in double: dense sweeps within the stated bound, negatives mirrored bit for bit,
// special values and exact cases through one rule, the same bits whichever loop of the array a value falls in.
#include "host/color/FastPow.h"

#include <bit>
#include <cfloat>
#include <cmath>
#include <limits>
#include <vector>

#include <gtest/gtest.h>

using namespace Orvane;

namespace fastpowtest {

// The stated bound: ulp of a normal result, units of the smallest subnormal for a subnormal one.
constexpr double kBoundUlp = 0.55;
constexpr float kInf = std::numeric_limits<float>::infinity();
constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();

float FromBits(uint32_t b) { return std::bit_cast<float>(b); }
uint32_t Bits(float f) { return std::bit_cast<uint32_t>(f); }

std::vector<float> Pow(const std::vector<float> &x, float e) {
    std::vector<float> out(x.size(), -7.0f);
    PowAbsSigned(x.data(), e, out.data(), static_cast<int>(x.size()));
    return out;
}

// Sweep inputs: floats over [1e-30, 1e30] at a stride, every float within 2^-10 of 1 (where large exponents are
// most sensitive), subnormals at a stride.
std::vector<float> SweepInputs() {
    std::vector<float> xs;
    for (uint32_t b = Bits(1e-30f); b <= Bits(1e30f); b += 1021) xs.push_back(FromBits(b));
    for (uint32_t b = Bits(1.0f - 0x1p-10f); b <= Bits(1.0f + 0x1p-10f); ++b) xs.push_back(FromBits(b));
    for (uint32_t b = 1; b < 0x00800000u; b += 4093) xs.push_back(FromBits(b));
    xs.insert(xs.end(), {FromBits(0x007fffffu), FLT_MIN, FLT_MAX}); // the largest subnormal, the ends
    return xs;
}

/// How far `got` is from the exact `want`, in ulp (or smallest subnormals below FLT_MIN). Past FLT_MAX the result
/// must be inf (within 1e-8 of the threshold FLT_MAX too): 0 then, infinity for a wrong overflow or sign.
double ErrorUlp(float got, double want) {
    const double a = std::fabs(want), inf = std::numeric_limits<double>::infinity();
    if (std::signbit(got) != std::signbit(want)) return inf;
    const double overflow = 0x1p128 * (1.0 - 0x1p-25); // rounds to inf from here up
    if (a >= overflow * (1.0 + 1e-8)) return std::isinf(got) ? 0.0 : inf;
    if (a > overflow * (1.0 - 1e-8) && std::isinf(got)) return 0.0;
    if (std::isinf(got) || std::isnan(got)) return inf;
    const double err = std::fabs(static_cast<double>(got) - want);
    if (a < static_cast<double>(FLT_MIN)) return err / 0x1p-149;
    int exp2;
    std::frexp(a, &exp2); // a in [2^(exp2 - 1), 2^exp2)
    return err / std::ldexp(1.0, exp2 - 24);
}

} // namespace fastpowtest

using namespace fastpowtest;

TEST(FastPow, MatchesDoublePowMirrorsNegativesSpecialValuesAndSameBitsWherever) {
    const std::vector<float> pos = SweepInputs();
    std::vector<float> neg = pos;
    for (float &x : neg) x = -x;
    for (float e : {0.0f, 1e-5f, 0.1f, 0.4545f, 0.5f, 1.0f, 1.3f, 2.2f, 5.0f, 100.0f, 100000.0f, -0.4545f, -2.2f}) {
        const std::vector<float> got = Pow(pos, e), gotNeg = Pow(neg, e);
        double worst = 0.0;
        float worstX = 0.0f;
        int unmirrored = 0;
        for (size_t i = 0; i < pos.size(); ++i) {
            const double err = ErrorUlp(got[i], std::pow(static_cast<double>(pos[i]), static_cast<double>(e)));
            if (!(err <= worst)) worst = err, worstX = pos[i]; // NaN counts as worst
            // A negative input gives exactly the negated result of its magnitude.
            if (Bits(gotNeg[i]) != (Bits(got[i]) ^ 0x80000000u) && ++unmirrored <= 3)
                ADD_FAILURE() << "exponent " << e << ": " << neg[i] << " gives " << gotNeg[i];
        }
        EXPECT_LE(worst, kBoundUlp) << "exponent " << e << " at x = " << worstX;
    }
    // copysign(|x|^e, x) from std::pow in double: a result that is a float must come out bit for bit, any other
    // within the bound. NaN in gives that same NaN out, for every exponent (std::pow gives 1 for NaN^0).
    std::vector<float> xs = {0.0f, FromBits(1), 1e-40f, 1e-30f, 0x1p-70f, 0x1p-50f, 1e-20f, 0.3f,    0.5f, 0.9999f,
                             1.0f, 1.0001f,     2.0f,   3.0f,   1.8e19f,  3.0e19f,  1e30f,  FLT_MAX, kInf, 123.456f};
    for (int k = -40; k <= 40; ++k) xs.push_back(std::ldexp(1.0f, k));
    for (size_t i = 0, n = xs.size(); i < n; ++i) xs.push_back(-xs[i]);
    const float nans[] = {kNaN, -kNaN, FromBits(0x7fc00001u), FromBits(0xffbfffffu), FromBits(0xffc12345u)};
    for (size_t i = 0; i < std::size(nans); ++i) xs.insert(xs.begin() + 7 * i, nans[i]); // inside the vector loop too
    for (float e : {0.0f,     -0.0f, 1e-30f, 1e-5f, 0.25f,   0.4545f, 0.5f,   1.0f,   1.0001f,   1.5f,
                    2.0f,     2.1f,  2.2f,   3.0f,  3.02f,   5.0f,    100.0f, 200.0f, 100000.0f, 1e30f,
                    -0.4545f, -1.0f, -2.0f,  -3.0f, -200.0f, kInf,    -kInf,  kNaN}) {
        const std::vector<float> gotSpecial = Pow(xs, e);
        for (size_t i = 0; i < xs.size(); ++i) {
            const float x = xs[i];
            if (std::isnan(x)) {
                EXPECT_EQ(Bits(gotSpecial[i]), Bits(x)) << "NaN 0x" << std::hex << Bits(x) << " ^ " << e;
                continue;
            }
            const double want = std::copysign(std::pow(std::fabs(static_cast<double>(x)), static_cast<double>(e)), x);
            if (std::isnan(want))
                EXPECT_TRUE(std::isnan(gotSpecial[i])) << x << " ^ " << e;
            else if (static_cast<double>(static_cast<float>(want)) == want)
                EXPECT_EQ(Bits(gotSpecial[i]), Bits(static_cast<float>(want)))
                    << x << " ^ " << e << " gave " << gotSpecial[i];
            else
                EXPECT_LE(ErrorUlp(gotSpecial[i], want), kBoundUlp) << x << " ^ " << e << " gave " << gotSpecial[i];
        }
    }
    // Values of every kind at varying positions and lengths: the bulk and the last few take different loops.
    std::vector<float> pool;
    for (int i = 0; i < 97; ++i) pool.push_back(std::ldexp(1.0f + 0.37f * static_cast<float>(i % 7), i % 41 - 20));
    pool[5] = 0.0f, pool[11] = -kInf, pool[17] = kNaN, pool[23] = FromBits(3), pool[29] = -0.3f;
    for (float e : {0.4545f, 1.0f, 2.2f, 100.0f}) {
        std::vector<float> single(pool.size());
        for (size_t i = 0; i < pool.size(); ++i) PowAbsSigned(&pool[i], e, &single[i], 1);
        for (int count : {0, 1, 2, 3, 4, 5, 7, 8, 9, 15, 16, 17, 31, 33, 63, 64, 65, 97})
            for (int offset : {0, 1, 3}) {
                if (offset + count > static_cast<int>(pool.size())) continue;
                std::vector<float> out(count + 1, -7.0f), inPlace(pool.begin() + offset, pool.begin() + offset + count);
                PowAbsSigned(pool.data() + offset, e, out.data(), count);
                PowAbsSigned(inPlace.data(), e, inPlace.data(), count);
                EXPECT_EQ(out[count], -7.0f) << "written past the end, count " << count;
                for (int i = 0; i < count; ++i)
                    EXPECT_TRUE(Bits(out[i]) == Bits(single[offset + i]) && Bits(inPlace[i]) == Bits(out[i]))
                        << "count " << count << " index " << i;
            }
    }
}
