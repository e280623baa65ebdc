#pragma once
// The Color Corrector's pixel function in its histogram modes (Equalize,
// Match). Process counts the histograms and builds the curves (Histogram.h);
// a pixel then only reads them:
//  1. pre-divide: R, G, B over alpha, or 0 where alpha is exactly 0;
//  2. R, G, B as 16-bit values, as they were counted (clamped to 0..1,
//     times 65535, rounded);
//  3. with a luminance curve: into the luma-first space, the luma through
//     the L curve at its bin (value >> shift), back to RGB, clamped to
//     0..65535 and rounded;
//  4. R, G and B each through their own curve at their bin;
//  5. back to 0..1, alpha unchanged; post-multiply by alpha, flushed to 0
//     within 1e-6.
// The curves carry the blend amounts of the controls, so a channel left at 0
// reads the identity curve (which still rounds to the bins).
//
// Thread safety: read-only once Process has filled it.
#include <vector>

#include "host/color/Histogram.h"
#include "operators/color/ColorCorrectorRanges.h"

namespace Orvane::cc {

struct HistogramSettings {
    const Histogram *curves = nullptr;
    /// The R, G and B curves as 0..1 (value / 65535), Size() each, so a pixel reads its result at once.
    std::vector<float> rgb[3];
    bool luminance = false; ///< step 3 runs
    bool preDivide = false, postMultiply = false;
    Matrix34 toLumaFirst, fromLumaFirst;
};

inline int To16(float v) {
    float c = v > 0.f ? v : 0.f; // NaN reads as 0
    c = c < 1.f ? c : 1.f;
    return static_cast<int>(c * 65535.f + 0.5f);
}
inline float Clamp16(float v) {
    const float c = v > 0.f ? v : 0.f;
    return c < 65535.f ? c : 65535.f;
}

/// The histogram correction of up to kBlock pixels, in place. Stage by stage
/// over the block, so that all but the curve look-ups compile to vector
/// operations.
inline void HistogramBlock(const HistogramSettings &s, float (*p)[4], int n) {
    if (s.preDivide)
        for (int k = 0; k < n; ++k) PreDivide(p[k]);
    const Histogram &h = *s.curves;
    const int shift = h.Shift();
    int v[3][kBlock];
    for (int k = 0; k < n; ++k)
        for (int i = 0; i < 3; ++i) v[i][k] = To16(p[k][i]);
    if (s.luminance) {
        const Matrix34 &to = s.toLumaFirst, &from = s.fromLumaFirst;
        float y[3][kBlock];
        for (int k = 0; k < n; ++k) {
            const float in[3] = {float(v[0][k]), float(v[1][k]), float(v[2][k])};
            for (int i = 0; i < 3; ++i)
                y[i][k] = to.m[i][0] * in[0] + to.m[i][1] * in[1] + to.m[i][2] * in[2] + to.m[i][3];
        }
        for (int k = 0; k < n; ++k) y[0][k] = h.GetValueL(static_cast<int>(Clamp16(y[0][k]) + 0.5f) >> shift);
        for (int k = 0; k < n; ++k)
            for (int i = 0; i < 3; ++i)
                v[i][k] = static_cast<int>(
                    Clamp16(from.m[i][0] * y[0][k] + from.m[i][1] * y[1][k] + from.m[i][2] * y[2][k] + from.m[i][3]) +
                    0.5f);
    }
    const float *r = s.rgb[0].data(), *g = s.rgb[1].data(), *b = s.rgb[2].data();
    for (int k = 0; k < n; ++k) {
        p[k][0] = r[v[0][k] >> shift];
        p[k][1] = g[v[1][k] >> shift];
        p[k][2] = b[v[2][k] >> shift];
    }
    if (s.postMultiply)
        for (int k = 0; k < n; ++k) {
            const float a = p[k][3] > -1e-6f && p[k][3] < 1e-6f ? 0.f : p[k][3];
            for (int i = 0; i < 3; ++i) p[k][i] *= a;
        }
}

/// The histogram correction of one pixel, in place.
inline void HistogramPixel(const HistogramSettings &s, float p[4]) {
    HistogramBlock(s, reinterpret_cast<float(*)[4]>(p), 1);
}

} // namespace Orvane::cc
