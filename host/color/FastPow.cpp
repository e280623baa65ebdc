#include "host/color/FastPow.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <cstring>

namespace Orvane {

namespace fastpow_impl {
namespace {

// log2(m) = t * P(t^2), t = (m - 1) / (m + 1), for m in [sqrt(1/2), sqrt(2)),
// so t^2 in [0, 0.02944]. Minimax on relative error, 4.3e-12.
constexpr double kLog0 = 2.8853900817901419;
constexpr double kLog1 = 0.96179667326618878;
constexpr double kLog2 = 0.57708360034289141;
constexpr double kLog3 = 0.4116717452544042;
constexpr double kLog4 = 0.34074898797987913;

// 2^f = 1 + f * Q(f) for f in [-1/2, 1/2]. Minimax on relative error,
// 2.0e-9; the constant term is exactly 1 so that 2^0 = 1 exactly.
constexpr double kExp1 = 0.69314720285504516;
constexpr double kExp2 = 0.24022647913632114;
constexpr double kExp3 = 0.055503324711592965;
constexpr double kExp4 = 0.0096184373574363952;
constexpr double kExp5 = 0.0013398874403576732;
constexpr double kExp6 = 0.00015353361947210455;

// Inputs with |e * log2|x|| > kLimit give 0 or inf: 2^160 overflows a float
// and 2^-160 rounds to 0. The others stay well inside double's exponent range
// on the way.
constexpr double kLimit = 160.0;
// Adding 1.5 * 2^52 rounds a double of magnitude below 2^51 to a whole number
// and leaves that number in the low bits of the sum.
constexpr double kRound = 0x1.8p52;

constexpr uint32_t kSignBit = 0x80000000u;
constexpr uint32_t kInfBits = 0x7f800000u;
constexpr uint32_t kOneBits = 0x3f800000u;
constexpr uint32_t kMinNormalBits = 0x00800000u;
// Bits of sqrt(1/2) as a float: subtracting them puts the split point of the
// mantissa range at sqrt(1/2) instead of 1.
constexpr int32_t kSqrtHalfBits = 0x3f3504f3;

/// `cond ? a : b` as bit arithmetic, which GCC keeps branch-free (see
/// PowStreams).
inline uint32_t Select(bool cond, uint32_t a, uint32_t b) {
    const uint32_t mask = 0u - static_cast<uint32_t>(cond);
    return (a & mask) | (b & ~mask);
}

/// 2^z for |z| < 1000, relative error about 2e-9: the kernel's own steps.
double Exp2Near(double z) {
    const double s = z + kRound;
    const double f = z - (s - kRound);
    const double q = 1.0 + f * (kExp1 + f * (kExp2 + f * (kExp3 + f * (kExp4 + f * (kExp5 + f * kExp6)))));
    return std::bit_cast<double>(std::bit_cast<uint64_t>(q) + (std::bit_cast<uint64_t>(s) << 52));
}

/// Loop-invariant values of one call.
struct Consts {
    double e;
    // Magnitudes (as bits) outside [low, high] have |e * log2|x|| > kLimit
    // (up to the 2e-9 of Exp2Near); 0 and inf always lie outside. Inside,
    // |e * log2|x|| stays below kLimit plus a little. What those below and
    // above give.
    int32_t low, high;
    uint32_t belowResult, aboveResult;

    explicit Consts(double exponent) : e(exponent) {
        constexpr int32_t kMaxBits = 0x7f7fffff; // FLT_MAX
        // |log2 x| beyond which |y| > kLimit. The bounds 2^(-+reach) are
        // rounded to floats towards 1.
        const double reach = kLimit / std::fabs(e);
        high = kMaxBits;
        if (reach < 128.0) {
            const double h = Exp2Near(reach);
            const float hf = static_cast<float>(h);
            high = std::bit_cast<int32_t>(hf) - (hf > h ? 1 : 0);
        }
        low = 1; // the smallest subnormal
        if (reach < 149.0) {
            const double l = Exp2Near(-reach);
            const float lf = static_cast<float>(l);
            low = std::max(std::bit_cast<int32_t>(lf) + (lf < l ? 1 : 0), 1);
        }
        belowResult = e > 0.0 ? 0u : kInfBits;
        aboveResult = e > 0.0 ? kInfBits : 0u;
    }
};

// x^e for W interleaved streams of n elements each: element i of stream j is
// at i + j * n. A single element's chain (division, two polynomials, the
// conversions) is long; with one stream the CPU runs out of room to overlap
// iterations and waits on latency. Each step below is therefore written for
// all W streams before the next begins, which gives it independent work.
//
// Every element takes the same straight-line code: inputs out of range (0 and
// inf among them) and NaN run through it (giving garbage, without traps) and
// are replaced at the end by masks. Written with `?:`, GCC turns those
// selects into branches, sinks the division into one of them, and then cannot
// vectorise the loop (the division might trap).
template <int W> [[gnu::always_inline]] inline void PowStreams(const float *x, float *out, int n, const Consts &c) {
#if !defined(__clang__) // Clang has no plain equivalent (its assume_safety also forces vectorisation)
#pragma GCC ivdep
#endif
    for (int i = 0; i < n; ++i) {
        uint32_t ix[W];
        int32_t ia[W];
        double m[W], k[W], t[W], y[W], s[W], f[W], q[W];
#pragma GCC unroll 8
        for (int j = 0; j < W; ++j) { // |x| = 2^k * m, m in [sqrt(1/2), sqrt(2))
            ix[j] = std::bit_cast<uint32_t>(x[i + j * n]);
            ia[j] = static_cast<int32_t>(ix[j] & ~kSignBit);
            // Subnormals (and 0) scaled by 2^23 into the normal range; exact.
            const uint32_t sub = 0u - static_cast<uint32_t>(ia[j] < static_cast<int32_t>(kMinNormalBits));
            const float a = std::bit_cast<float>(ia[j]) * std::bit_cast<float>(kOneBits + (sub & (23u << 23)));
            const int32_t bits = std::bit_cast<int32_t>(a);
            const int32_t kr = (bits - kSqrtHalfBits) >> 23;
            m[j] = std::bit_cast<float>(bits - (kr << 23));
            k[j] = static_cast<double>(kr - static_cast<int32_t>(sub & 23u));
        }
#pragma GCC unroll 8
        for (int j = 0; j < W; ++j) t[j] = (m[j] - 1.0) / (m[j] + 1.0);
#pragma GCC unroll 8
        for (int j = 0; j < W; ++j) { // y = e * log2|x|; log2|x| exact for 2^k
            const double u = t[j] * t[j];
            const double p = kLog0 + u * (kLog1 + u * (kLog2 + u * (kLog3 + u * kLog4)));
            y[j] = c.e * (k[j] + t[j] * p);
        }
#pragma GCC unroll 8
        for (int j = 0; j < W; ++j) { // y = n + f, n whole (in the low bits of s), f in [-1/2, 1/2]
            s[j] = y[j] + kRound;
            f[j] = y[j] - (s[j] - kRound); // exact
        }
#pragma GCC unroll 8
        for (int j = 0; j < W; ++j)
            q[j] =
                1.0 + f[j] * (kExp1 + f[j] * (kExp2 + f[j] * (kExp3 + f[j] * (kExp4 + f[j] * (kExp5 + f[j] * kExp6)))));
#pragma GCC unroll 8
        for (int j = 0; j < W; ++j) {
            // 2^n * q: n (two's complement) added to q's exponent field; in
            // range, |n| <= 160 keeps it a normal double. Then one rounding,
            // to float.
            const uint64_t scaled = std::bit_cast<uint64_t>(q[j]) + (std::bit_cast<uint64_t>(s[j]) << 52);
            uint32_t r = std::bit_cast<uint32_t>(static_cast<float>(std::bit_cast<double>(scaled)));
            r = Select(ia[j] < c.low, c.belowResult, r);
            r = Select(ia[j] > c.high, c.aboveResult, r);
            r |= ix[j] & kSignBit;
            // NaN: the input itself.
            out[i + j * n] = std::bit_cast<float>(Select(ia[j] > static_cast<int32_t>(kInfBits), ix[j], r));
        }
    }
}

// The kernel, for finite exponents other than 0 and 1: four streams over the
// bulk of the array, then one for the last few elements. Both give the same
// bits for the same input. Built twice, for x86-64-v3 (AVX2 + FMA) and for the
// baseline, picked at load time.
__attribute__((target_clones("arch=x86-64-v3", "default"))) void PowKernel(const float *x, double e, float *out,
                                                                           int count) {
    constexpr int kStreams = 4;
    const Consts c(e);
    const int n = count / kStreams;
    PowStreams<kStreams>(x, out, n, c);
    PowStreams<1>(x + kStreams * n, out + kStreams * n, count - kStreams * n, c);
}

} // namespace
} // namespace fastpow_impl

void PowAbsSigned(const float *x, float exponent, float *out, int count) {
    if (exponent == 1.0f) {
        if (out != x && count > 0) std::memcpy(out, x, static_cast<size_t>(count) * sizeof(float));
        return;
    }
    if (exponent == 0.0f || !std::isfinite(exponent)) {
        // Rare exponents: no need for speed. NaN stays NaN even to the power 0.
        for (int i = 0; i < count; ++i)
            out[i] = std::isnan(x[i]) ? x[i] : std::copysign(std::pow(std::fabs(x[i]), exponent), x[i]);
        return;
    }
    fastpow_impl::PowKernel(x, exponent, out, count);
}

} // namespace Orvane
