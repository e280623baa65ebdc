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
};

/// The whole pixel function's settings.
struct PixelSettings {
    RangeRecord records[3]; ///< shadows, midtones, highlights (each with Master in it)
    int tintMode = TintBetter;
    Matrix34 toLumaFirst, fromLumaFirst;
    bool rangesInUse = false, gammaAfterLevels = false, preDivide = false, postMultiply = false;
    const ColorCurvesTable *curves = nullptr; ///< needed when rangesInUse
};

/// Hue of R, G, B in 0..1 (0 for grey), as the suppression table reads it.
inline float HueOf(float r, float g, float b) {
    const float mx = r > g ? (r > b ? r : b) : (g > b ? g : b), mn = r < g ? (r < b ? r : b) : (g < b ? g : b);
    if (mx == mn) return 0.f;
    const float d = mx - mn;
    float h = mx == r ? (g - b) / d : mx == g ? (b - r) / d + 2.f : (r - g) / d + 4.f;
    h /= 6.f;
    return h < 0.f ? h + 1.f : h;
}

/// Pixels the block functions below take at a time at most.
constexpr int kBlock = 256;

/// One record's range function on n pixels p (RGBA) with luminances L, into
/// out (which may be p itself). Stage by stage over the block, each flag
/// tested once, so the multiply-add stages compile to vector operations.
inline void RangeBlock(const PixelSettings &s, const RangeRecord &r, const float *L, const float (*p)[4],
                       float (*out)[4], int n) {
    if (out != p)
        for (int k = 0; k < n; ++k)
            for (int i = 0; i < 4; ++i) out[k][i] = p[k][i];
    if (r.doMatrix)
        for (int k = 0; k < n; ++k) {
            const float in[3] = {out[k][0], out[k][1], out[k][2]};
            if (s.tintMode == TintFast || (L[k] >= 0.f && L[k] <= 1.f)) {
                (L[k] < 0.5f ? r.low : r.high).Apply(in, out[k]);
            } else {
                float y[3], z[3];
                s.toLumaFirst.Apply(in, y);
                const float luma = y[0];
                const bool below = L[k] < 0.f;
                y[0] = below ? std::fmax(y[0], 0.f) : std::fmin(y[0], 1.f);
                (below ? r.belowBlack : r.aboveWhite).Apply(y, z);
                z[0] = luma;
                s.fromLumaFirst.Apply(z, out[k]);
            }
        }
    auto levels = [out, n](const float *mul, const float *add) {
        for (int k = 0; k < n; ++k)
            for (int i = 0; i < 3; ++i) out[k][i] = out[k][i] * mul[i] + add[i];
    };
    auto gamma = [out, n, &r] { // a true power with the sign kept, one channel's values at a time
        float plane[kBlock];
        for (int i = 0; i < 3; ++i) {
            if (r.gamma[i] == 1.f) continue;
            for (int k = 0; k < n; ++k) plane[k] = out[k][i];
            PowAbsSigned(plane, r.gamma[i], plane, n);
            for (int k = 0; k < n; ++k) out[k][i] = plane[k];
        }
    };
    if (s.gammaAfterLevels) {
        if (r.doLevels1) levels(r.mul1, r.add1);
        if (r.doGamma) gamma();
        if (r.doLevels2) levels(r.mul2, r.add2);
    } else { // gamma first; the second multiply-add stage does not run in this order
        if (r.doGamma) gamma();
        if (r.doLevels1) levels(r.mul1, r.add1);
    }
    if (const Suppression *t = r.suppression)
        for (int k = 0; k < n; ++k) {
            float *c = out[k];
            int i = static_cast<int>(Suppression::kSamples * HueOf(c[0], c[1], c[2]));
            i = i < 0 ? 0 : i >= Suppression::kSamples ? Suppression::kSamples - 1 : i;
            const float f = t->factor[i];
            if (std::fabs(f - 1.f) > 1e-6f) {
                const float d = (t->wR * c[0] + t->wG * c[1] + t->wB * c[2] + t->offset) * (1.f - f);
                for (int j = 0; j < 3; ++j) c[j] = c[j] * f + d;
            }
        }
}

/// The range function of one pixel.
inline void RangeFunction(const PixelSettings &s, const RangeRecord &r, float L, const float p[4], float out[4]) {
    RangeBlock(s, r, &L, reinterpret_cast<const float(*)[4]>(p), reinterpret_cast<float(*)[4]>(out), 1);
}

/// Step 1: R, G, B over alpha, or 0 where alpha is exactly 0.
inline void PreDivide(float p[4]) {
    if (p[3] == 0.f)
        p[0] = p[1] = p[2] = 0.f;
    else
        for (int i = 0; i < 3; ++i) p[i] /= p[3];
}

inline float LumaOf(const float p[4]) { return 0.299f * p[0] + 0.587f * p[1] + 0.114f * p[2]; }

/// The whole correction of up to kBlock pixels, in place.
inline void CorrectBlock(const PixelSettings &s, float (*p)[4], int n) {
    if (s.preDivide)
        for (int k = 0; k < n; ++k) PreDivide(p[k]);
    float L[kBlock];
    if (s.rangesInUse || s.records[0].doMatrix)
        for (int k = 0; k < n; ++k) L[k] = LumaOf(p[k]);
    else
        std::fill(L, L + n, 0.f);
    if (!s.rangesInUse) {
        RangeBlock(s, s.records[0], L, p, p, n);
    } else {
        float sum[kBlock][4] = {}, part[kBlock][4], w[kBlock][3];
        for (int k = 0; k < n; ++k) s.curves->WeightsAt(L[k], w[k][0], w[k][1], w[k][2]);
        for (int r = 0; r < 3; ++r) {
            RangeBlock(s, s.records[r], L, p, part, n);
            for (int k = 0; k < n; ++k)
                for (int i = 0; i < 4; ++i) sum[k][i] += w[k][r] * part[k][i];
        }
        std::copy(&sum[0][0], &sum[0][0] + 4 * n, &p[0][0]);
    }
    if (s.postMultiply)
        for (int k = 0; k < n; ++k) {
            const float a = p[k][3] > -1e-6f && p[k][3] < 1e-6f ? 0.f : p[k][3];
            for (int i = 0; i < 3; ++i) p[k][i] *= a;
        }
}

/// The whole correction of one pixel, in place.
inline void CorrectPixel(const PixelSettings &s, float p[4]) { CorrectBlock(s, reinterpret_cast<float(*)[4]>(p), 1); }

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
