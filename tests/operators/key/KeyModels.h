#pragma once
// The keyers' arithmetic written out in double for the tests, independently
// of the tools' own code: luminance, the chroma box, hue as the hexcone's
// angle, saturation, the threshold ramp.
#include <algorithm>
#include <array>
#include <cmath>

#include "operators/key/KeyFunctions.h"

namespace Orvane::keytest {

using Rgb = std::array<double, 3>;

inline double Luma(const Rgb &c) { return 0.299 * c[0] + 0.587 * c[1] + 0.114 * c[2]; }

/// A colour on the chroma box's four axes: key type 0 the chroma axes, 1
/// plain colour; luminance fourth.
inline std::array<double, 4> ChromaAxesModel(int keyType, const Rgb &c) {
    const double y = Luma(c);
    const double scale[3] = {0.61035, 0.76294, 0.45776};
    std::array<double, 4> v;
    for (int i = 0; i < 3; ++i) v[i] = keyType == 0 ? (c[i] - y) * scale[i] + 0.5 : c[i];
    v[3] = y;
    return v;
}

/// The chroma key of a colour: the distance outside the box on the worst
/// axis, over the soft range.
inline double ChromaModel(const ChromaKeyRanges &k, const Rgb &c) {
    const std::array<double, 4> v = ChromaAxesModel(k.keyType, c);
    double outside = 0.0;
    for (int i = 0; i < 4; ++i) outside = std::max({outside, v[i] - k.high[i], k.low[i] - v[i]});
    if (outside <= 0.0) return 0.0;
    return k.soft > 0.0 ? std::min(outside, double(k.soft)) / k.soft : 1.0;
}

/// How near a colour lies to a limit of the box (on any axis): keys of
/// colours this near may fall either side after rounding.
inline double ChromaEdgeDistance(const ChromaKeyRanges &k, const Rgb &c) {
    const std::array<double, 4> v = ChromaAxesModel(k.keyType, c);
    double d = 1e9;
    for (int i = 0; i < 4; ++i) d = std::min({d, std::fabs(v[i] - k.low[i]), std::fabs(v[i] - k.high[i])});
    return d;
}

inline ChromaKeyRanges Ranges(int keyType, std::array<float, 4> low, std::array<float, 4> high, float soft) {
    ChromaKeyRanges k;
    k.keyType = keyType, k.soft = soft;
    for (int i = 0; i < 4; ++i) k.low[i] = low[i], k.high[i] = high[i];
    return k;
}

/// Hue as the hexcone's angle over a turn: the sector of the largest
/// component and the position within it, in sixths.
inline double HueModel(const Rgb &c) {
    const double mx = std::max({c[0], c[1], c[2]}), mn = std::min({c[0], c[1], c[2]});
    if (mx - mn <= 1e-6) return 0.0;
    double sixths;
    if (mx == c[0])
        sixths = std::fmod((c[1] - c[2]) / (mx - mn) + 6.0, 6.0);
    else if (mx == c[1])
        sixths = (c[2] - c[0]) / (mx - mn) + 2.0;
    else
        sixths = (c[0] - c[1]) / (mx - mn) + 4.0;
    return sixths / 6.0;
}

inline double SaturationModel(const Rgb &c) {
    const double mx = std::max({c[0], c[1], c[2]}), mn = std::min({c[0], c[1], c[2]});
    return mx - mn <= 1e-6 ? 0.0 : (mx - mn) / mx;
}

/// 0 up to low, 1 from high, a straight line between.
inline double RampModel(double v, double low, double high) {
    if (v <= low) return 0.0;
    if (v >= high) return 1.0;
    return (v - low) / (high - low);
}

} // namespace Orvane::keytest
