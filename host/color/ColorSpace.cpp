#include "host/color/ColorSpace.h"

#include <algorithm>
#include <cmath>

namespace Orvane {

namespace colorspace_impl {
namespace {

// ---- RGB <-> XYZ ----
// The matrix is built from the primaries' and white point's xy chromaticities
// rather than typed in, so RGB (1, 1, 1) lands exactly on the white point the
// L*a*b* formulas divide by.

struct ColorMat3 {
    double m[3][3];
};

constexpr ColorMat3 ColorMatInverse(const ColorMat3 &a) {
    const auto &m = a.m;
    double c00 = m[1][1] * m[2][2] - m[1][2] * m[2][1];
    double c01 = m[1][2] * m[2][0] - m[1][0] * m[2][2];
    double c02 = m[1][0] * m[2][1] - m[1][1] * m[2][0];
    double det = m[0][0] * c00 + m[0][1] * c01 + m[0][2] * c02;
    ColorMat3 r{};
    r.m[0][0] = c00 / det;
    r.m[1][0] = c01 / det;
    r.m[2][0] = c02 / det;
    r.m[0][1] = (m[0][2] * m[2][1] - m[0][1] * m[2][2]) / det;
    r.m[1][1] = (m[0][0] * m[2][2] - m[0][2] * m[2][0]) / det;
    r.m[2][1] = (m[0][1] * m[2][0] - m[0][0] * m[2][1]) / det;
    r.m[0][2] = (m[0][1] * m[1][2] - m[0][2] * m[1][1]) / det;
    r.m[1][2] = (m[0][2] * m[1][0] - m[0][0] * m[1][2]) / det;
    r.m[2][2] = (m[0][0] * m[1][1] - m[0][1] * m[1][0]) / det;
    return r;
}

// Rec.709 / sRGB primaries and the D65 white point (CIE xy).
constexpr double kPrimX[3] = {0.64, 0.30, 0.15};
constexpr double kPrimY[3] = {0.33, 0.60, 0.06};
constexpr double kWhiteX = 0.3127, kWhiteY = 0.3290;

// XYZ of the white point, with Y = 1.
constexpr double kWhite[3] = {kWhiteX / kWhiteY, 1.0, (1.0 - kWhiteX - kWhiteY) / kWhiteY};

constexpr ColorMat3 MakeRGBToXYZ() {
    // Columns: XYZ of each primary at Y = 1, then scaled so that the three sum
    // to the white point.
    ColorMat3 p{};
    for (int c = 0; c < 3; ++c) {
        p.m[0][c] = kPrimX[c] / kPrimY[c];
        p.m[1][c] = 1.0;
        p.m[2][c] = (1.0 - kPrimX[c] - kPrimY[c]) / kPrimY[c];
    }
    ColorMat3 inv = ColorMatInverse(p);
    double s[3] = {};
    for (int i = 0; i < 3; ++i) s[i] = inv.m[i][0] * kWhite[0] + inv.m[i][1] * kWhite[1] + inv.m[i][2] * kWhite[2];
    for (int r = 0; r < 3; ++r)
        for (int c = 0; c < 3; ++c) p.m[r][c] *= s[c];
    return p;
}

constexpr ColorMat3 kRGBToXYZ = MakeRGBToXYZ();
constexpr ColorMat3 kXYZToRGB = ColorMatInverse(kRGBToXYZ);

// CIE L*a*b* companding: a cube root above (6/29)^3, a straight line below.
constexpr double kLabDelta = 6.0 / 29.0;
constexpr double kLabDelta3 = kLabDelta * kLabDelta * kLabDelta;
constexpr double kLabSlope = 1.0 / (3.0 * kLabDelta * kLabDelta);

inline double LabF(double t) { return t > kLabDelta3 ? std::cbrt(t) : t * kLabSlope + 4.0 / 29.0; }
inline double LabFInv(double u) { return u > kLabDelta ? u * u * u : (u - 4.0 / 29.0) / kLabSlope; }

void RGBToLab(const double rgb[3], double lab[3]) {
    double f[3];
    for (int i = 0; i < 3; ++i) {
        const double *row = kRGBToXYZ.m[i];
        f[i] = LabF((row[0] * rgb[0] + row[1] * rgb[1] + row[2] * rgb[2]) / kWhite[i]);
    }
    lab[0] = 116.0 * f[1] - 16.0;
    lab[1] = 500.0 * (f[0] - f[1]);
    lab[2] = 200.0 * (f[1] - f[2]);
}

void LabToRGB(const double lab[3], double rgb[3]) {
    double fy = (lab[0] + 16.0) / 116.0;
    double xyz[3] = {LabFInv(fy + lab[1] / 500.0) * kWhite[0], LabFInv(fy) * kWhite[1],
                     LabFInv(fy - lab[2] / 200.0) * kWhite[2]};
    for (int i = 0; i < 3; ++i) {
        const double *row = kXYZToRGB.m[i];
        rgb[i] = row[0] * xyz[0] + row[1] * xyz[1] + row[2] * xyz[2];
    }
}

// ---- hue ----

// Hue of a colour with chroma `delta` > 0 and largest channel `mx`, in [0, 1).
double HueOf(const double rgb[3], double mx, double delta) {
    double h;
    if (rgb[0] == mx)
        h = (rgb[1] - rgb[2]) / delta;
    else if (rgb[1] == mx)
        h = 2.0 + (rgb[2] - rgb[0]) / delta;
    else
        h = 4.0 + (rgb[0] - rgb[1]) / delta;
    h /= 6.0;
    if (h < 0.0) h += 1.0;
    return h >= 1.0 ? 0.0 : h;
}

// RGB from hue (any value; wrapped), largest channel and chroma.
void RGBFromHue(double h, double mx, double chroma, double rgb[3]) {
    if (!std::isfinite(h)) h = 0.0;
    h -= std::floor(h);
    double h6 = h * 6.0;
    int sector = static_cast<int>(h6);
    double f = h6 - sector;
    if (sector >= 6) sector = 0;
    double p = mx - chroma;           // smallest channel
    double q = mx - chroma * f;       // falling channel
    double t = mx - chroma * (1 - f); // rising channel
    switch (sector) {
    case 0: rgb[0] = mx, rgb[1] = t, rgb[2] = p; break;
    case 1: rgb[0] = q, rgb[1] = mx, rgb[2] = p; break;
    case 2: rgb[0] = p, rgb[1] = mx, rgb[2] = t; break;
    case 3: rgb[0] = p, rgb[1] = q, rgb[2] = mx; break;
    case 4: rgb[0] = t, rgb[1] = p, rgb[2] = mx; break;
    default: rgb[0] = mx, rgb[1] = p, rgb[2] = q; break;
    }
}

void RGBToHSV(const double rgb[3], double hsv[3]) {
    double mx = std::max({rgb[0], rgb[1], rgb[2]});
    double delta = mx - std::min({rgb[0], rgb[1], rgb[2]});
    hsv[0] = hsv[1] = 0.0;
    hsv[2] = mx;
    if (delta > 0.0 && mx != 0.0) {
        hsv[0] = HueOf(rgb, mx, delta);
        hsv[1] = delta / mx;
    }
}

void HSVToRGB(const double hsv[3], double rgb[3]) { RGBFromHue(hsv[0], hsv[2], hsv[2] * hsv[1], rgb); }

// 1 - |2L - 1|: the chroma an HLS saturation of 1 stands for at lightness L.
inline double HLSChromaScale(double l) { return 1.0 - std::fabs(2.0 * l - 1.0); }

void RGBToHLS(const double rgb[3], double hls[3]) {
    double mx = std::max({rgb[0], rgb[1], rgb[2]});
    double mn = std::min({rgb[0], rgb[1], rgb[2]});
    double delta = mx - mn;
    hls[0] = hls[2] = 0.0;
    hls[1] = 0.5 * (mx + mn);
    double scale = HLSChromaScale(hls[1]);
    if (delta > 0.0 && scale != 0.0) {
        hls[0] = HueOf(rgb, mx, delta);
        hls[2] = delta / scale;
    }
}

void HLSToRGB(const double hls[3], double rgb[3]) {
    double chroma = hls[2] * HLSChromaScale(hls[1]);
    RGBFromHue(hls[0], hls[1] + 0.5 * chroma, chroma, rgb);
}

} // namespace
} // namespace colorspace_impl

void RGBToSpaceDouble(ColorSpaceType space, const double in[3], double out[3]) {
    const double rgb[3] = {in[0], in[1], in[2]};
    switch (space) {
    case ColorSpaceType::HLS: colorspace_impl::RGBToHLS(rgb, out); break;
    case ColorSpaceType::HSV: colorspace_impl::RGBToHSV(rgb, out); break;
    case ColorSpaceType::LAB: colorspace_impl::RGBToLab(rgb, out); break;
    default: out[0] = rgb[0], out[1] = rgb[1], out[2] = rgb[2]; break;
    }
}

void SpaceToRGBDouble(ColorSpaceType space, const double in[3], double out[3]) {
    const double val[3] = {in[0], in[1], in[2]};
    switch (space) {
    case ColorSpaceType::HLS: colorspace_impl::HLSToRGB(val, out); break;
    case ColorSpaceType::HSV: colorspace_impl::HSVToRGB(val, out); break;
    case ColorSpaceType::LAB: colorspace_impl::LabToRGB(val, out); break;
    default: out[0] = val[0], out[1] = val[1], out[2] = val[2]; break;
    }
}

void RGBToSpace(ColorSpaceType space, const float in[3], float out[3]) {
    const double rgb[3] = {in[0], in[1], in[2]};
    double res[3];
    RGBToSpaceDouble(space, rgb, res);
    for (int i = 0; i < 3; ++i) out[i] = static_cast<float>(res[i]);
    // A hue just under one turn can round up to 1 in float; keep it in [0, 1).
    if ((space == ColorSpaceType::HLS || space == ColorSpaceType::HSV) && out[0] >= 1.0f) out[0] = 0.0f;
}

void SpaceToRGB(ColorSpaceType space, const float in[3], float out[3]) {
    const double val[3] = {in[0], in[1], in[2]};
    double rgb[3];
    SpaceToRGBDouble(space, val, rgb);
    for (int i = 0; i < 3; ++i) out[i] = static_cast<float>(rgb[i]);
}

} // namespace Orvane
