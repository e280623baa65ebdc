#pragma once
// The per-pixel work of the Color Corrector. ColorCorrector::Process folds
// every control (the Master range included) into three RangeRecords, one per
// tonal range, so the pixel function below only tests flags, multiplies and
// adds; it never looks at a control.
//
// One pixel (float; integer depths arrive as 0..1):
//  1. pre-divide: R, G, B over alpha, or 0 where alpha is exactly 0;
//  2. L = 0.299 R + 0.587 G + 0.114 B (left 0 when nothing reads it);
//  3. without ranges: the range function of the first record; with ranges,
//     the three range functions weighted by the range curves and summed;
//  4. post-multiply by the result's alpha, flushed to 0 within 1e-6.
// The range function: the colour stage (a matrix chosen by L, with the
// luma-first detour for pixels below black and above white in the Full and
// Better tint modes), levels and gamma in the chosen order, and suppression
// of colours by hue.
//
// Thread safety: everything here is read-only once Process has filled it.
#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>

#include "host/color/ColorCurvesTable.h"
#include "host/color/FastPow.h"

namespace Orvane::cc {

/// 3 by 3 and an offset column: out = m[i][0] a + m[i][1] b + m[i][2] c + m[i][3].
struct Matrix34 {
    float m[3][4] = {{1.f, 0.f, 0.f, 0.f}, {0.f, 1.f, 0.f, 0.f}, {0.f, 0.f, 1.f, 0.f}};
    void Apply(const float in[3], float out[3]) const {
        for (int i = 0; i < 3; ++i) out[i] = m[i][0] * in[0] + m[i][1] * in[1] + m[i][2] * in[2] + m[i][3];
    }
};

/// Factors of suppression by hue, with the desaturation's luminance weights.
struct Suppression {
    static constexpr int kSamples = 360;
    float factor[kSamples];
    float wR = 0.299f, wG = 0.587f, wB = 0.114f, offset = 0.f;
};

enum TintMode { TintFast = 0, TintFull = 1, TintBetter = 2 };

struct RangeRecord {
    bool doMatrix = false, doGamma = false, doLevels1 = false, doLevels2 = false;
    Matrix34 low, high;              ///< RGB, for L below 0.5 and from 0.5 up
    Matrix34 belowBlack, aboveWhite; ///< luma-first space, for L below 0 and above 1
    float gamma[3] = {1.f, 1.f, 1.f};
    float mul1[3] = {1.f, 1.f, 1.f}, add1[3] = {0.f, 0.f, 0.f};
    float mul2[3] = {1.f, 1.f, 1.f}, add2[3] = {0.f, 0.f, 0.f};
    const Suppression *suppression = nullptr;
    /// Set by SetFiniteWithin: finite pixels within kFiniteInput (all four
    /// values) give finite results. Only then may a block whose weights for
    /// this range are all 0 skip it: 0 times a finite value adds nothing to
    /// the sum, 0 times inf or NaN would.
    bool finiteWithin = false;
};

/// The bound on input values for RangeRecord::finiteWithin.
constexpr float kFiniteInput = 65536.f;

/// The whole pixel function's settings.
struct PixelSettings {
    RangeRecord records[3]; ///< shadows, midtones, highlights (each with Master in it)
    int tintMode = TintBetter;
    Matrix34 toLumaFirst, fromLumaFirst;
    bool rangesInUse = false, gammaAfterLevels = false, preDivide = false, postMultiply = false;
    const ColorCurvesTable *curves = nullptr; ///< needed when rangesInUse
};

/// c ? a : b, by bit masks. Both values must be computed whatever c is, so a
/// loop of these has no branch and compiles to vector code; a plain ?: over
/// computed values lets the compiler move their arithmetic under a branch
/// (float operations may trap), and the loop stays scalar.
inline float Pick(bool c, float a, float b) {
    const uint32_t mask = 0u - static_cast<uint32_t>(c);
    return std::bit_cast<float>((std::bit_cast<uint32_t>(a) & mask) | (std::bit_cast<uint32_t>(b) & ~mask));
}

/// Hue of R, G, B in 0..1 (0 for grey), as the suppression table reads it.
/// Every operation runs for every pixel and selects pick the results, so
/// that loops over planes of pixels compile to vector code (a conditional
/// float operation would keep them scalar); the selected values are the ones
/// a branching form computes, bit for bit.
inline float HueOf(float r, float g, float b) {
    const float mx = r > g ? (r > b ? r : b) : (g > b ? g : b), mn = r < g ? (r < b ? r : b) : (g < b ? g : b);
    const float d = mx - mn;
    const bool redMax = mx == r, greenMax = mx == g;
    const float fromRed = g - b, fromGreen = b - r, fromBlue = r - g;
    const float q = Pick(redMax, fromRed, Pick(greenMax, fromGreen, fromBlue)) / d;
    const float shifted = q + Pick(greenMax, 2.f, 4.f);
    const float h = Pick(redMax, q, shifted) / 6.f, wrapped = h + 1.f;
    return Pick(mx == mn, 0.f, Pick(h < 0.f, wrapped, h));
}

/// Sets r.finiteWithin from a bound on the size of every stage's results, in
/// double, for inputs of size at most kFiniteInput. The bound stays far below
/// the float range, so the float rounding along the way cannot reach it.
inline void SetFiniteWithin(const PixelSettings &s, RangeRecord &r) {
    auto size = [](float v) { return std::isfinite(v) ? std::fabs(double(v)) : HUGE_VAL; };
    auto sizeThrough = [&size](const Matrix34 &m, double x) {
        double most = 0.0;
        for (int i = 0; i < 3; ++i)
            most = std::max(most, (size(m.m[i][0]) + size(m.m[i][1]) + size(m.m[i][2])) * x + size(m.m[i][3]));
        return most;
    };
    double x = kFiniteInput;
    if (r.doMatrix) {
        double most = std::max(sizeThrough(r.low, x), sizeThrough(r.high, x));
        if (s.tintMode != TintFast) {
            const double y = sizeThrough(s.toLumaFirst, x);
            const double z = std::max(y, std::max(sizeThrough(r.belowBlack, y), sizeThrough(r.aboveWhite, y)));
            most = std::max(most, sizeThrough(s.fromLumaFirst, z));
        }
        x = most;
    }
    auto levels = [&x, &size](const float *mul, const float *add) {
        double most = 0.0;
        for (int i = 0; i < 3; ++i) most = std::max(most, size(mul[i]) * x + size(add[i]));
        x = most;
    };
    bool powerBounded = true;
    auto gamma = [&] {
        for (int i = 0; i < 3; ++i) powerBounded = powerBounded && r.gamma[i] >= 0.f && r.gamma[i] < 64.f;
        if (!powerBounded) return;
        double most = x;
        for (int i = 0; i < 3; ++i) most = std::max(most, std::pow(std::max(x, 1.0), double(r.gamma[i])));
        x = most;
    };
    if (s.gammaAfterLevels) {
        if (r.doLevels1) levels(r.mul1, r.add1);
        if (r.doGamma) gamma();
        if (r.doLevels2) levels(r.mul2, r.add2);
    } else {
        if (r.doGamma) gamma();
        if (r.doLevels1) levels(r.mul1, r.add1);
    }
    if (const Suppression *t = r.suppression) {
        double f = 0.0;
        for (float v : t->factor) f = std::max(f, size(v));
        const double grey = (size(t->wR) + size(t->wG) + size(t->wB)) * x + size(t->offset);
        x = std::max(x, x * f + grey * (1.0 + f));
    }
    r.finiteWithin = powerBounded && x < 1e30; // a value that is not finite counts as unbounded
}

/// Pixels the block functions below take at a time at most.
constexpr int kBlock = 256;

/// A block of pixels as four planes: R, G, B, A.
using Planes = float[4][kBlock];

/// One record's range function on n pixels `in` with luminances L, into out
/// (which may be `in` itself). Stage by stage over the planes, each flag
/// tested once, so every stage compiles to vector operations.
inline void RangePlanes(const PixelSettings &s, const RangeRecord &r, const float *L, const Planes &in, Planes &out,
                        int n) {
    if (r.doMatrix) {
        // Pixels below black or above white (or not a number) take the
        // luma-first detour in the Full and Better modes; they are rare, and
        // are worked out first since `out` may be `in`.
        int detours = 0, at[kBlock];
        float detour[kBlock][3];
        if (s.tintMode != TintFast)
            for (int k = 0; k < n; ++k) {
                if (L[k] >= 0.f && L[k] <= 1.f) continue;
                const float rgb[3] = {in[0][k], in[1][k], in[2][k]};
                float y[3], z[3];
                s.toLumaFirst.Apply(rgb, y);
                const float luma = y[0];
                const bool below = L[k] < 0.f;
                y[0] = below ? std::fmax(y[0], 0.f) : std::fmin(y[0], 1.f);
                (below ? r.belowBlack : r.aboveWhite).Apply(y, z);
                z[0] = luma;
                s.fromLumaFirst.Apply(z, detour[detours]);
                at[detours++] = k;
            }
        // Both halves' matrices for every pixel, the one for its luminance kept.
        const Matrix34 lo = r.low, hi = r.high; // copies: `out` cannot alias them
        for (int k = 0; k < n; ++k) {
            const float a = in[0][k], b = in[1][k], c = in[2][k];
            const bool dark = L[k] < 0.5f;
            for (int i = 0; i < 3; ++i) {
                const float vl = lo.m[i][0] * a + lo.m[i][1] * b + lo.m[i][2] * c + lo.m[i][3];
                const float vh = hi.m[i][0] * a + hi.m[i][1] * b + hi.m[i][2] * c + hi.m[i][3];
                out[i][k] = Pick(dark, vl, vh);
            }
        }
        for (int j = 0; j < detours; ++j)
            for (int i = 0; i < 3; ++i) out[i][at[j]] = detour[j][i];
    } else if (&out != &in) {
        for (int i = 0; i < 3; ++i) std::copy(in[i], in[i] + n, out[i]);
    }
    if (&out != &in) std::copy(in[3], in[3] + n, out[3]);
    auto levels = [&out, n](const float *mul, const float *add) {
        for (int i = 0; i < 3; ++i)
            for (int k = 0; k < n; ++k) out[i][k] = out[i][k] * mul[i] + add[i];
    };
    auto gamma = [&out, n, &r] { // a true power with the sign kept
        for (int i = 0; i < 3; ++i)
            if (r.gamma[i] != 1.f) PowAbsSigned(out[i], r.gamma[i], out[i], n);
    };
    if (s.gammaAfterLevels) {
        if (r.doLevels1) levels(r.mul1, r.add1);
        if (r.doGamma) gamma();
        if (r.doLevels2) levels(r.mul2, r.add2);
    } else { // gamma first; the second multiply-add stage does not run in this order
        if (r.doGamma) gamma();
        if (r.doLevels1) levels(r.mul1, r.add1);
    }
    if (r.suppression) {
        const Suppression &t = *r.suppression;
        const float wR = t.wR, wG = t.wG, wB = t.wB, offset = t.offset;
        int index[kBlock];
        for (int k = 0; k < n; ++k) {
            const int i = static_cast<int>(Suppression::kSamples * HueOf(out[0][k], out[1][k], out[2][k]));
            index[k] = i < 0 ? 0 : i >= Suppression::kSamples ? Suppression::kSamples - 1 : i;
        }
        float factor[kBlock];
        for (int k = 0; k < n; ++k) factor[k] = t.factor[index[k]];
        for (int k = 0; k < n; ++k) {
            const float f = factor[k], c0 = out[0][k], c1 = out[1][k], c2 = out[2][k];
            const bool moves = std::fabs(f - 1.f) > 1e-6f;
            const float d = (wR * c0 + wG * c1 + wB * c2 + offset) * (1.f - f);
            const float m0 = c0 * f + d, m1 = c1 * f + d, m2 = c2 * f + d;
            out[0][k] = Pick(moves, m0, c0);
            out[1][k] = Pick(moves, m1, c1);
            out[2][k] = Pick(moves, m2, c2);
        }
    }
}

/// The range function of one pixel.
inline void RangeFunction(const PixelSettings &s, const RangeRecord &r, float L, const float p[4], float out[4]) {
    Planes q;
    for (int i = 0; i < 4; ++i) q[i][0] = p[i];
    RangePlanes(s, r, &L, q, q, 1);
    for (int i = 0; i < 4; ++i) out[i] = q[i][0];
}

/// The whole correction of up to kBlock pixels (RGBA) from `from` into p
/// (which may be `from` itself).
inline void CorrectBlock(const PixelSettings &s, const float (*from)[4], float (*p)[4], int n) {
    Planes in;
    for (int k = 0; k < n; ++k)
        for (int i = 0; i < 4; ++i) in[i][k] = from[k][i];
    if (s.preDivide)
        for (int k = 0; k < n; ++k) {
            const float a = in[3][k];
            for (int i = 0; i < 3; ++i) {
                const float divided = in[i][k] / a;
                in[i][k] = Pick(a == 0.f, 0.f, divided);
            }
        }
    float L[kBlock];
    if (s.rangesInUse || s.records[0].doMatrix)
        for (int k = 0; k < n; ++k) L[k] = 0.299f * in[0][k] + 0.587f * in[1][k] + 0.114f * in[2][k];
    else
        std::fill(L, L + n, 0.f);
    Planes *result = &in;
    Planes sum;
    if (!s.rangesInUse) {
        RangePlanes(s, s.records[0], L, in, in, n);
    } else {
        Planes part;
        float w[3][kBlock];
        for (int k = 0; k < n; ++k) s.curves->WeightsAt(L[k], w[0][k], w[1][k], w[2][k]);
        int outside = 0; // values not finite or beyond kFiniteInput (an int sum, so the loop vectorises)
        for (int i = 0; i < 4; ++i)
            for (int k = 0; k < n; ++k) outside += !(std::fabs(in[i][k]) <= kFiniteInput);
        const bool bounded = outside == 0;
        bool started = false;
        for (int r = 0; r < 3; ++r) {
            if (bounded && s.records[r].finiteWithin && std::all_of(w[r], w[r] + n, [](float v) { return v == 0.f; }))
                continue; // adds only zeros to the sum
            RangePlanes(s, s.records[r], L, in, part, n);
            if (!started) // 0 + x, as a sum from 0 would give (-0 becomes +0)
                for (int i = 0; i < 4; ++i)
                    for (int k = 0; k < n; ++k) sum[i][k] = 0.f + w[r][k] * part[i][k];
            else
                for (int i = 0; i < 4; ++i)
                    for (int k = 0; k < n; ++k) sum[i][k] += w[r][k] * part[i][k];
            started = true;
        }
        if (!started)
            for (int i = 0; i < 4; ++i) std::fill(sum[i], sum[i] + n, 0.f);
        result = &sum;
    }
    Planes &o = *result;
    if (s.postMultiply)
        for (int k = 0; k < n; ++k) {
            const float a = o[3][k] > -1e-6f && o[3][k] < 1e-6f ? 0.f : o[3][k];
            for (int i = 0; i < 3; ++i) o[i][k] *= a;
        }
    for (int k = 0; k < n; ++k)
        for (int i = 0; i < 4; ++i) p[k][i] = o[i][k];
}

/// The whole correction of one pixel, in place.
inline void CorrectPixel(const PixelSettings &s, float p[4]) {
    CorrectBlock(s, reinterpret_cast<float(*)[4]>(p), reinterpret_cast<float(*)[4]>(p), 1);
}

/// Step 1: R, G, B over alpha, or 0 where alpha is exactly 0.
inline void PreDivide(float p[4]) {
    if (p[3] == 0.f)
        p[0] = p[1] = p[2] = 0.f;
    else
        for (int i = 0; i < 3; ++i) p[i] /= p[3];
}

inline float LumaOf(const float p[4]) { return 0.299f * p[0] + 0.587f * p[1] + 0.114f * p[2]; }

/// Which weight RangeOutput shows.
enum RangeShown { ShowResult = 0, ShowShadows = 1, ShowMidtones = 2, ShowHighlights = 3 };

/// The range weights as a picture: "Result" puts shadows, midtones and
/// highlights in R, G and B; a single range shows its weight as grey. Alpha 1.
inline void RangeOutput(const PixelSettings &s, int shown, float p[4]) {
    if (s.preDivide) PreDivide(p);
    float w[3];
    s.curves->WeightsAt(LumaOf(p), w[0], w[1], w[2]);
    if (shown == ShowResult)
        p[0] = w[0], p[1] = w[1], p[2] = w[2];
    else
        p[0] = p[1] = p[2] = w[shown - 1];
    p[3] = 1.f;
}

} // namespace Orvane::cc
