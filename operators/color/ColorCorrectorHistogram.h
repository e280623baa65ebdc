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
#include "host/color/Histogram.h"
#include "operators/color/ColorCorrectorRanges.h"

namespace Orvane::cc {

struct HistogramSettings {
    const Histogram *curves = nullptr;
    bool luminance = false; ///< step 3 runs
    bool preDivide = false, postMultiply = false;
    Matrix34 toLumaFirst, fromLumaFirst;
};

inline int To16(float v) {
    const float c = v > 0.f ? (v < 1.f ? v : 1.f) : 0.f; // NaN reads as 0
    return static_cast<int>(c * 65535.f + 0.5f);
}

/// The histogram correction of one pixel, in place.
inline void HistogramPixel(const HistogramSettings &s, float p[4]) {
    if (s.preDivide) PreDivide(p);
    const Histogram &h = *s.curves;
    const int shift = h.Shift();
    int v[3] = {To16(p[0]), To16(p[1]), To16(p[2])};
    if (s.luminance) {
        float in[3] = {float(v[0]), float(v[1]), float(v[2])}, y[3], back[3];
        s.toLumaFirst.Apply(in, y);
        const float luma = y[0] > 0.f ? (y[0] < 65535.f ? y[0] : 65535.f) : 0.f;
        y[0] = static_cast<float>(h.GetValueL(static_cast<int>(luma + 0.5f) >> shift));
        s.fromLumaFirst.Apply(y, back);
        for (int i = 0; i < 3; ++i)
            v[i] = static_cast<int>((back[i] > 0.f ? (back[i] < 65535.f ? back[i] : 65535.f) : 0.f) + 0.5f);
    }
    p[0] = h.GetValueR(v[0] >> shift) / 65535.f;
    p[1] = h.GetValueG(v[1] >> shift) / 65535.f;
    p[2] = h.GetValueB(v[2] >> shift) / 65535.f;
    if (s.postMultiply) {
        const float a = p[3] > -1e-6f && p[3] < 1e-6f ? 0.f : p[3];
        for (int i = 0; i < 3; ++i) p[i] *= a;
    }
}

} // namespace Orvane::cc
