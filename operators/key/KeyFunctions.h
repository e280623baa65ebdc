#pragma once
// The per-pixel matte functions of the simple keyers, in a float form and a
// 16-bit form (values 0..65535; 8-bit images are widened to it). The device
// kernels ("ChromaKeyer", "LumaKey", "DifferenceKeyer") compute the float
// forms in the same order of operations.
//
//   Luminance     Y = 0.299 R + 0.587 G + 0.114 B
//                 16-bit: (9797 R + 19235 G + 3736 B) >> 15 on the chroma
//                 axes; the luma key rounds it, (19595 R + 38470 G + 7471 B
//                 + 32768) >> 16
//   Chroma axes   r = (R - Y) 0.61035 + 0.5, g = (G - Y) 0.76294 + 0.5,
//                 b = (B - Y) 0.45776 + 0.5 (key type 0; type 1 keeps R, G, B)
//                 16-bit: (((C - Y) k) >> 15) + 32768, k = 20000, 25000,
//                 15000, clamped to 0..65535
//   Chroma key    0 inside the box of the four ranges (ends included); beyond
//                 it the largest of min(max(v - hi, lo - v, 0), s) / s over
//                 the four axes, s the soft range; 1 when s is 0
//   Threshold     0 at v <= low, 1 at v >= high, else (v - low) / (high - low)
//                 (luma and difference keys); low = high gives a hard step
//   Saturation    (max - min) / max; 0 when max - min <= 1e-6
//   Hue           0 red, 1/6 yellow, 1/3 green, 1/2 cyan, 2/3 blue, 5/6 magenta
//   Difference    the largest absolute difference of R, G and B
//
// Thread safety: pure functions.
#include <algorithm>
#include <cmath>
#include <cstdint>

namespace Orvane {

// ---- shared -----------------------------------------------------------------

inline float KeyLuminance(float r, float g, float b) { return 0.299f * r + 0.587f * g + 0.114f * b; }
inline int32_t KeyLuminance16(int32_t r, int32_t g, int32_t b) { return (9797 * r + 19235 * g + 3736 * b) >> 15; }
/// The luminance rounded to the nearest step (weights in 1/65536), for keys
/// on luminance itself.
inline int32_t KeyLuminanceRounded16(int32_t r, int32_t g, int32_t b) {
    return static_cast<int32_t>((19595LL * r + 38470LL * g + 7471LL * b + 32768) >> 16);
}

/// A 0..1 value (a control's) in 16-bit steps, not clamped, so that limits
/// outside 0..1 keep their meaning.
inline int64_t KeySteps16(double v) { return std::llround(v * 65535.0); }

/// The threshold key of a value, `inverse` 1 / (high - low) worked out once.
inline float KeyThreshold(float v, float low, float high, float inverse) {
    if (v <= low) return 0.f;
    if (v >= high) return 1.f;
    return (v - low) * inverse;
}
inline uint16_t KeyThreshold16(int64_t v, int64_t low, int64_t high) {
    if (v <= low) return 0;
    if (v >= high) return 65535;
    const int64_t span = high - low;
    return static_cast<uint16_t>(((v - low) * 65535 + span / 2) / span);
}

// ---- chroma key -------------------------------------------------------------

struct ChromaKeyRanges {
    float low[4] = {0.f, 0.f, 0.f, 0.f}; ///< red, green, blue, luminance axes
    float high[4] = {1.f, 1.f, 1.f, 1.f};
    float soft = 0.f; ///< SoftRange
    int keyType = 0;  ///< 0 the chroma axes, 1 plain colour
};

inline void ChromaKeyAxes(int keyType, float r, float g, float b, float v[4]) {
    const float y = KeyLuminance(r, g, b);
    if (keyType == 0) {
        v[0] = (r - y) * 0.61035f + 0.5f;
        v[1] = (g - y) * 0.76294f + 0.5f;
        v[2] = (b - y) * 0.45776f + 0.5f;
    } else {
        v[0] = r, v[1] = g, v[2] = b;
    }
    v[3] = y;
}

inline float ChromaKeyAlpha(const ChromaKeyRanges &k, float r, float g, float b) {
    float v[4];
    ChromaKeyAxes(k.keyType, r, g, b, v);
    bool inside = true;
    for (int i = 0; i < 4; ++i) inside = inside && v[i] >= k.low[i] && v[i] <= k.high[i];
    if (inside) return 0.f;
    if (!(k.soft > 0.f)) return 1.f;
    float alpha = 0.f;
    for (int i = 0; i < 4; ++i)
        alpha = std::max(alpha, std::min(std::max(std::max(v[i] - k.high[i], k.low[i] - v[i]), 0.f), k.soft) / k.soft);
    return alpha;
}

/// The ranges in 16-bit steps.
struct ChromaKeyRanges16 {
    int64_t low[4], high[4], soft;
    int keyType;
    explicit ChromaKeyRanges16(const ChromaKeyRanges &k) : soft(KeySteps16(k.soft)), keyType(k.keyType) {
        for (int i = 0; i < 4; ++i) low[i] = KeySteps16(k.low[i]), high[i] = KeySteps16(k.high[i]);
    }
};

inline void ChromaKeyAxes16(int keyType, int32_t r, int32_t g, int32_t b, int32_t v[4]) {
    const int32_t y = KeyLuminance16(r, g, b);
    if (keyType == 0) {
        v[0] = std::clamp((((r - y) * 20000) >> 15) + 32768, 0, 65535);
        v[1] = std::clamp((((g - y) * 25000) >> 15) + 32768, 0, 65535);
        v[2] = std::clamp((((b - y) * 15000) >> 15) + 32768, 0, 65535);
    } else {
        v[0] = r, v[1] = g, v[2] = b;
    }
    v[3] = y;
}

inline uint16_t ChromaKeyAlpha16(const ChromaKeyRanges16 &k, int32_t r, int32_t g, int32_t b) {
    int32_t v[4];
    ChromaKeyAxes16(k.keyType, r, g, b, v);
    bool inside = true;
    for (int i = 0; i < 4; ++i) inside = inside && v[i] >= k.low[i] && v[i] <= k.high[i];
    if (inside) return 0;
    if (k.soft <= 0) return 65535;
    int64_t out = 0;
    for (int i = 0; i < 4; ++i) out = std::max(out, std::max<int64_t>({v[i] - k.high[i], k.low[i] - v[i], 0}));
    return static_cast<uint16_t>((std::min(out, k.soft) * 65535 + k.soft / 2) / k.soft);
}

// ---- luma key ---------------------------------------------------------------

/// LumaKeyer's Channel entries.
enum LumaChannel : int {
    LumaBlue = 0,
    LumaGreen = 1,
    LumaRed = 2,
    LumaAlpha = 3,
    LumaLuminance = 4,
    LumaSaturation = 5,
    LumaHue = 6,
    LumaDepth = 7,
};

inline float KeySaturation(float r, float g, float b) {
    const float mx = std::max(r, std::max(g, b)), mn = std::min(r, std::min(g, b));
    return mx - mn <= 1e-6f ? 0.f : (mx - mn) / mx;
}

inline float KeyHue(float r, float g, float b) {
    const float mx = std::max(r, std::max(g, b)), mn = std::min(r, std::min(g, b)), d = mx - mn;
    if (d <= 1e-6f) return 0.f;
    float h;
    if (std::fabs(r - mx) <= 1e-6f)
        h = (g - b) * 0.5f / d;
    else if (std::fabs(g - mx) <= 1e-6f)
        h = (b - r) * 0.5f / d + 1.f;
    else
        h = (r - g) * 0.5f / d + 2.f;
    h = h / 3.f;
    return h < 0.f ? h + 1.f : h;
}

/// The key value of a pixel for `channel` (`z` its depth).
inline float LumaKeyValue(int channel, float r, float g, float b, float a, float z) {
    switch (channel) {
    case LumaBlue: return b;
    case LumaGreen: return g;
    case LumaRed: return r;
    case LumaAlpha: return a;
    case LumaSaturation: return KeySaturation(r, g, b);
    case LumaHue: return KeyHue(r, g, b);
    case LumaDepth: return z;
    default: return KeyLuminance(r, g, b);
    }
}

/// The key value in 16-bit steps for the channels other than depth:
/// saturation and hue are worked out in float and rounded to a step.
inline int32_t LumaKeyValue16(int channel, int32_t r, int32_t g, int32_t b, int32_t a) {
    constexpr float s = 1.f / 65535.f;
    switch (channel) {
    case LumaBlue: return b;
    case LumaGreen: return g;
    case LumaRed: return r;
    case LumaAlpha: return a;
    case LumaSaturation: return static_cast<int32_t>(std::lround(KeySaturation(r * s, g * s, b * s) * 65535.f));
    case LumaHue: return static_cast<int32_t>(std::lround(KeyHue(r * s, g * s, b * s) * 65535.f));
    default: return KeyLuminanceRounded16(r, g, b);
    }
}

// ---- difference key ---------------------------------------------------------

inline float KeyDifference(const float f[3], const float b[3]) {
    return std::max(std::fabs(f[0] - b[0]), std::max(std::fabs(f[1] - b[1]), std::fabs(f[2] - b[2])));
}
inline int32_t KeyDifference16(const uint16_t f[3], const uint16_t b[3]) {
    return std::max({std::abs(f[0] - b[0]), std::abs(f[1] - b[1]), std::abs(f[2] - b[2])});
}

} // namespace Orvane
