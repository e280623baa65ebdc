#include "host/color/FastPow.h"

#include <bit>
#include <cfloat>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <limits>
#include <vector>

#include <gtest/gtest.h>

using namespace Orvane;

namespace fastpowtest {

// The stated bound: ulp of the result for normal results, units of the
// smallest subnormal for subnormal ones.
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

float Pow1(float x, float e) {
    float out = -7.0f;
    PowAbsSigned(&x, e, &out, 1);
    return out;
}

// Positive inputs for the sweeps: float bit patterns over [1e-30, 1e30] at a
// stride (every binade, many mantissas), every float within 2^-10 of 1 (where
// large exponents are most sensitive), and subnormals at a stride.
std::vector<float> SweepInputs() {
    std::vector<float> xs;
    for (uint32_t b = Bits(1e-30f); b <= Bits(1e30f); b += 1021) xs.push_back(FromBits(b));
    for (uint32_t b = Bits(1.0f - 0x1p-10f); b <= Bits(1.0f + 0x1p-10f); ++b) xs.push_back(FromBits(b));
    for (uint32_t b = 1; b < 0x00800000u; b += 4093) xs.push_back(FromBits(b));
    xs.push_back(FromBits(0x007fffffu)); // largest subnormal
    xs.push_back(FLT_MIN);
    xs.push_back(FLT_MAX);
    return xs;
}

/// How far `got` is from the exact `want` (a double, positive or negative):
/// in ulp of want for a normal result, in units of the smallest subnormal
/// below FLT_MIN. Results past FLT_MAX must be inf, but within 1e-8 of the
/// rounding threshold FLT_MAX may come out too. Returns 0 for an accepted
/// overflow and infinity for a wrong one.
double ErrorUlp(float got, double want) {
    const double a = std::fabs(want);
    if (std::signbit(got) != std::signbit(want) && got != 0.0f) return std::numeric_limits<double>::infinity();
    const double overflow = 0x1p128 * (1.0 - 0x1p-25); // rounds to inf from here up
    if (a >= overflow * (1.0 + 1e-8)) return std::isinf(got) ? 0.0 : std::numeric_limits<double>::infinity();
    if (a > overflow * (1.0 - 1e-8) && std::isinf(got)) return 0.0;
    if (std::isinf(got) || std::isnan(got)) return std::numeric_limits<double>::infinity();
    const double err = std::fabs(static_cast<double>(got) - want);
    if (a < static_cast<double>(FLT_MIN)) return err / 0x1p-149;
    int exp2;
    std::frexp(a, &exp2); // a in [2^(exp2 - 1), 2^exp2)
    return err / std::ldexp(1.0, exp2 - 24);
}

struct Worst {
    double ulp = 0.0;
    float x = 0.0f;
    void Add(double err, float at) {
        if (!(err <= ulp)) ulp = err, x = at; // NaN counts as worst
    }
};

/// Largest error of PowAbsSigned over `xs` against std::pow in double (sign
/// carried as PowAbsSigned does).
Worst SweepError(const std::vector<float> &xs, float e) {
    const std::vector<float> got = Pow(xs, e);
    Worst w;
    for (size_t i = 0; i < xs.size(); ++i) {
        const double x = xs[i];
        const double want = std::copysign(std::pow(std::fabs(x), static_cast<double>(e)), x);
        w.Add(ErrorUlp(got[i], want), xs[i]);
    }
    return w;
}

} // namespace fastpowtest

using namespace fastpowtest;

TEST(FastPow, MatchesDoublePowOverDenseSweeps) {
    const std::vector<float> xs = SweepInputs();
    double overall = 0.0;
    for (float e : {0.0f, 1e-5f, 0.1f, 0.4545f, 0.5f, 1.0f, 1.3f, 2.2f, 5.0f, 100.0f, 100000.0f, -0.4545f, -2.2f}) {
        const Worst w = SweepError(xs, e);
        std::printf("[ max ulp  ] exponent %-8g %.4f (at x = %g)\n", e, w.ulp, w.x);
        EXPECT_LE(w.ulp, kBoundUlp) << "exponent " << e << " at x = " << w.x;
        overall = std::max(overall, w.ulp);
    }
    std::printf("[ max ulp  ] all exponents %.4f\n", overall);
    RecordProperty("max_ulp", std::to_string(overall));
}

TEST(FastPow, NegativeInputsMirrorThePositiveCurve) {
    std::vector<float> neg = SweepInputs();
    for (float &x : neg) x = -x;
    for (float e : {0.1f, 0.4545f, 1.3f, 2.2f, 100.0f}) {
        // Against the tool's true-power gamma, computed in double.
        const Worst w = SweepError(neg, e);
        EXPECT_LE(w.ulp, kBoundUlp) << "exponent " << e << " at x = " << w.x;
        // And exactly the negated result of |x|.
        std::vector<float> pos(neg.size());
        for (size_t i = 0; i < neg.size(); ++i) pos[i] = -neg[i];
        const std::vector<float> gotNeg = Pow(neg, e), gotPos = Pow(pos, e);
        int mismatches = 0;
        for (size_t i = 0; i < neg.size(); ++i)
            if (Bits(gotNeg[i]) != (Bits(gotPos[i]) ^ 0x80000000u) && ++mismatches <= 3)
                ADD_FAILURE() << "exponent " << e << ": " << neg[i] << " gives " << gotNeg[i] << ", " << pos[i]
                              << " gives " << gotPos[i];
    }
}

TEST(FastPow, ExponentOneReturnsTheInputBitForBit) {
    const std::vector<float> xs = {0.0f,
                                   -0.0f,
                                   1.0f,
                                   -1.0f,
                                   0.3f,
                                   -123.456f,
                                   FLT_MAX,
                                   -FLT_MIN,
                                   FromBits(1),
                                   kInf,
                                   -kInf,
                                   kNaN,
                                   FromBits(0xffc12345u)};
    const std::vector<float> got = Pow(xs, 1.0f);
    for (size_t i = 0; i < xs.size(); ++i) EXPECT_EQ(Bits(got[i]), Bits(xs[i])) << "x = " << xs[i];
}

TEST(FastPow, PlusMinusOneStayPlusMinusOne) {
    for (float e : {0.0f, 1e-30f, 1e-5f, 0.4545f, 2.2f, 100000.0f, 1e30f, -3.0f, kInf, -kInf, kNaN}) {
        EXPECT_EQ(Bits(Pow1(1.0f, e)), Bits(1.0f)) << "exponent " << e;
        EXPECT_EQ(Bits(Pow1(-1.0f, e)), Bits(-1.0f)) << "exponent " << e;
    }
}

TEST(FastPow, ZeroAndInfinity) {
    for (float e : {1e-30f, 1e-5f, 0.5f, 2.2f, 100000.0f, 1e30f}) {
        EXPECT_EQ(Bits(Pow1(0.0f, e)), Bits(0.0f)) << "exponent " << e;
        EXPECT_EQ(Bits(Pow1(-0.0f, e)), Bits(-0.0f)) << "exponent " << e;
        EXPECT_EQ(Pow1(kInf, e), kInf) << "exponent " << e;
        EXPECT_EQ(Pow1(-kInf, e), -kInf) << "exponent " << e;
        // Negative exponents turn them round, as std::pow does.
        EXPECT_EQ(Pow1(0.0f, -e), kInf) << "exponent " << -e;
        EXPECT_EQ(Pow1(-0.0f, -e), -kInf) << "exponent " << -e;
        EXPECT_EQ(Bits(Pow1(kInf, -e)), Bits(0.0f)) << "exponent " << -e;
        EXPECT_EQ(Bits(Pow1(-kInf, -e)), Bits(-0.0f)) << "exponent " << -e;
    }
}

TEST(FastPow, ExponentZeroGivesOneWithTheSignButKeepsNaN) {
    const std::vector<float> xs = {0.0f, -0.0f, FromBits(1), 0.5f, -3.0f, FLT_MAX, kInf, -kInf, kNaN};
    for (float zero : {0.0f, -0.0f}) {
        const std::vector<float> got = Pow(xs, zero);
        for (size_t i = 0; i < xs.size(); ++i) {
            if (std::isnan(xs[i]))
                EXPECT_TRUE(std::isnan(got[i]));
            else
                EXPECT_EQ(got[i], std::copysign(1.0f, xs[i])) << "x = " << xs[i];
        }
    }
}

TEST(FastPow, NaNInGivesTheSameNaNOut) {
    const float nans[] = {kNaN, -kNaN, FromBits(0x7fc00001u), FromBits(0xffbfffffu)};
    for (float e : {0.0f, 1e-5f, 0.5f, 1.0f, 2.2f, 1e30f, -2.0f}) {
        std::vector<float> xs(nans, nans + 4);
        xs.resize(37, 0.25f); // long enough to reach the vector code
        xs[20] = nans[1];
        const std::vector<float> got = Pow(xs, e);
        for (size_t i = 0; i < xs.size(); ++i)
            if (std::isnan(xs[i])) {
                EXPECT_TRUE(std::isnan(got[i])) << "exponent " << e << " index " << i;
            }
        EXPECT_EQ(Bits(got[0]), Bits(nans[0])) << "exponent " << e;
        EXPECT_EQ(Bits(got[1]), Bits(nans[1])) << "exponent " << e;
        EXPECT_EQ(Bits(got[20]), Bits(nans[1])) << "exponent " << e;
    }
}

TEST(FastPow, InfiniteAndNaNExponentsFollowStdPow) {
    const float xs[] = {0.0f, 1e-40f, 0.5f, 1.0f, 2.0f, 1e30f, kInf, -0.5f, -1.0f, -2.0f};
    for (float e : {kInf, -kInf, kNaN}) {
        for (float x : xs) {
            const float want = std::copysign(std::pow(std::fabs(x), e), x);
            const float got = Pow1(x, e);
            if (std::isnan(want))
                EXPECT_TRUE(std::isnan(got)) << x << " ^ " << e;
            else
                EXPECT_EQ(Bits(got), Bits(want)) << x << " ^ " << e;
        }
    }
}

TEST(FastPow, PowersOfTwoStayExact) {
    struct Case {
        float e;
        int step; // k runs over multiples of step, so that k * e is whole
    };
    for (const Case c : {Case{0.5f, 2}, Case{0.25f, 4}, Case{2.0f, 1}, Case{3.0f, 1}, Case{-1.0f, 1}, Case{1.5f, 2}}) {
        for (int k = -40; k <= 40; k += c.step) {
            const int n = static_cast<int>(k * c.e);
            if (n < -126 || n > 127) continue;
            EXPECT_EQ(Pow1(std::ldexp(1.0f, k), c.e), std::ldexp(1.0f, n)) << "2^" << k << " ^ " << c.e;
            EXPECT_EQ(Pow1(-std::ldexp(1.0f, k), c.e), -std::ldexp(1.0f, n)) << "-2^" << k << " ^ " << c.e;
        }
    }
}

TEST(FastPow, OverflowUnderflowAndSubnormalResults) {
    EXPECT_EQ(Pow1(2.0f, 200.0f), kInf);
    EXPECT_EQ(Pow1(-2.0f, 200.0f), -kInf);
    EXPECT_EQ(Pow1(1e30f, 2.2f), kInf);
    EXPECT_EQ(Pow1(FLT_MAX, 1.0001f), kInf);
    EXPECT_EQ(Pow1(1.0001f, 1e30f), kInf);
    EXPECT_EQ(Pow1(2.0f, -200.0f), 0.0f);
    EXPECT_EQ(Bits(Pow1(0.5f, 200.0f)), Bits(0.0f));
    EXPECT_EQ(Bits(Pow1(-0.5f, 200.0f)), Bits(-0.0f));
    EXPECT_EQ(Bits(Pow1(1e-30f, 5.0f)), Bits(0.0f));
    EXPECT_EQ(Bits(Pow1(0.9999f, 1e30f)), Bits(0.0f));
    // 2^-140 and 2^-149 are subnormal and exact.
    EXPECT_EQ(Pow1(0x1p-70f, 2.0f), 0x1p-140f);
    EXPECT_EQ(Pow1(0x1p-149f, 1.0f), 0x1p-149f);
    EXPECT_EQ(Pow1(0x1p-50f, 3.02f), 0.0f); // 2^-151: below half the smallest subnormal
    // A subnormal result that is not a power of two: to the nearest subnormal.
    EXPECT_LE(ErrorUlp(Pow1(1e-20f, 2.1f), std::pow(static_cast<double>(1e-20f), 2.1)), kBoundUlp);
    // Either side of FLT_MAX.
    EXPECT_EQ(Pow1(3.0e19f, 2.0f), kInf); // 9e38
    EXPECT_LE(ErrorUlp(Pow1(1.8e19f, 2.0f), std::pow(static_cast<double>(1.8e19f), 2.0)), kBoundUlp);
}

TEST(FastPow, SameBitsWhereverAValueLiesAndInPlace) {
    // Values of every kind at varying positions and array lengths: the bulk of
    // an array and its last few elements take different loops.
    std::vector<float> pool;
    for (int i = 0; i < 97; ++i) pool.push_back(std::ldexp(1.0f + 0.37f * static_cast<float>(i % 7), i % 41 - 20));
    pool[5] = 0.0f, pool[11] = -kInf, pool[17] = kNaN, pool[23] = FromBits(3), pool[29] = -0.3f;
    for (float e : {0.4545f, 2.2f, 100.0f}) {
        std::vector<float> single(pool.size());
        for (size_t i = 0; i < pool.size(); ++i) single[i] = Pow1(pool[i], e);
        for (int count : {1, 2, 3, 4, 5, 7, 8, 9, 15, 16, 17, 31, 33, 63, 64, 65, 97}) {
            for (int offset : {0, 1, 3}) {
                if (offset + count > static_cast<int>(pool.size())) continue;
                std::vector<float> out(count), inPlace(pool.begin() + offset, pool.begin() + offset + count);
                PowAbsSigned(pool.data() + offset, e, out.data(), count);
                PowAbsSigned(inPlace.data(), e, inPlace.data(), count);
                for (int i = 0; i < count; ++i) {
                    EXPECT_EQ(Bits(out[i]), Bits(single[offset + i])) << "count " << count << " index " << i;
                    EXPECT_EQ(Bits(inPlace[i]), Bits(single[offset + i])) << "count " << count << " index " << i;
                }
            }
        }
    }
}

TEST(FastPow, EmptyArrayWritesNothing) {
    float x = 0.5f, out = -7.0f;
    PowAbsSigned(&x, 2.2f, &out, 0);
    PowAbsSigned(&x, 1.0f, &out, 0);
    PowAbsSigned(&x, 0.0f, &out, 0);
    EXPECT_EQ(out, -7.0f);
}
