#pragma once
// FastPow: x^e over arrays of floats, fast and still a true power to float
// precision. Colour tools use it for gamma on float pixels, where a libm call
// per channel per pixel would dominate the row.
//
// PowAbsSigned(x, e, out, n) sets out[i] = copysign(|x[i]|^e, x[i]): the power
// of the magnitude, the sign of the input kept, so negative colour values stay
// negative and mirror the curve.
//
// Accuracy, against the power computed exactly (in double) and for a result in
// the normal float range: at most 0.55 ulp, that is the float rounding of the
// result (0.5 ulp) plus under 0.05 ulp from the approximations below; the
// worst seen over dense sweeps is 0.532 ulp. Results in the subnormal range
// are within 0.55 of the smallest subnormal. Results beyond FLT_MAX are
// +-inf and results below half the smallest subnormal are +-0, except within
// that same 0.05 ulp of either threshold, where the neighbouring value may
// come out instead.
//
// Exact cases and special values (s is the sign of x):
//  - exponent 1 returns x unchanged, bit for bit;
//  - x = +-1 gives +-1; x = 2^k, when k * e is a whole number n and 2^n a
//    normal float, gives 2^n exactly (4^0.5 = 2, 8^(-1) = 0.125);
//  - x = +-0 gives +-0 for exponents > 0 and s*inf for exponents < 0;
//  - exponent 0 gives s*1 for every x but NaN, 0^0 = 1 included;
//  - x = +-inf gives s*inf for exponents > 0 and s*0 for exponents < 0;
//  - NaN in gives NaN out (that same NaN), for every exponent, 0 included:
//    a pixel that is not a number stays so (std::pow would give 1 for NaN^0);
//  - exponent +-inf or NaN: as std::pow on |x| (so 1 for |x| = 1), sign kept.
// Subnormal inputs are normalised first and are as accurate as any other.
//
// How: |x| = 2^k * m with m in [sqrt(1/2), sqrt(2)) taken from the bits;
// log2(m) = t * P(t^2) with t = (m - 1) / (m + 1), P a degree-4 polynomial
// (relative error 4.3e-12); the product y = e * log2|x| and its split into a
// whole part n and a fraction f in [-1/2, 1/2] are done in double; 2^f is a
// degree-6 polynomial (relative error 2.0e-9), and n goes straight into the
// exponent bits. Double keeps the product's error far below a float ulp even
// where |y| is large (up to about 150 for a result in range), so the bound
// holds for every exponent. Inputs whose |y| would pass 160 (0 and inf among
// them) are found by comparing |x| with bounds worked out once per call, and
// give 0 or inf directly.
//
// The array loop has no branches and compiles to vector code: AVX2 with FMA
// where the CPU has them (x86-64-v3), plain SSE2 otherwise, chosen once at
// load time. The two may differ in the last bit (fused multiply-adds), both
// within the bound; on one machine a value gives the same bits wherever it
// lies in the array and however long the array is.
//
// `out` may be `x` itself (in place); otherwise the arrays must not overlap.
// Thread safety: a pure function on caller memory; safe from any thread.
#include "host/core/Export.h"

namespace Orvane {

/// out[i] = copysign(|x[i]|^exponent, x[i]) for i in [0, count); see above.
ORVANE_API void PowAbsSigned(const float *x, float exponent, float *out, int count);

} // namespace Orvane
