#include "host/color/Gamut.h"

#include <algorithm>
#include <cmath>

namespace Orvane {
namespace gamutcurve {

constexpr double kRec709A = 1.09929682680944, kRec709B = 0.018053968510807;
constexpr double kLn10 = 2.302585092994046;

/// f applied to |v| with the sign put back.
template <class F> double Mirrored(double v, F f) { return v < 0.0 ? -f(-v) : f(v); }

double SafeGamma(double g) { return std::isfinite(g) && g > 0.01 ? g : (std::isfinite(g) ? 0.01 : 1.0); }

/// The Cineon settings made usable, and the numbers the curve needs.
struct Cineon {
    double black, white, step, offset, slope, knee, kneeWidth;
    explicit Cineon(const CineonLogParams &p) {
        black = std::isfinite(p.black) ? p.black : 95.0;
        white = std::isfinite(p.white) && p.white > black ? p.white : black + 1.0;
        const double filmGamma = std::isfinite(p.filmGamma) && p.filmGamma > 0.01 ? p.filmGamma : 0.01;
        step = 0.002 / filmGamma;
        offset = std::pow(10.0, (black - white) * step);
        slope = kLn10 * step * offset / (1.0 - offset); // d linear / d code at black
        const double soft = std::isfinite(p.softClip) ? std::clamp(p.softClip, 0.0, white - black) : 0.0;
        knee = soft > 0.0 ? Base(white - soft) : 2.0; // above 1 only as "off"
        kneeWidth = 1.0 - knee;
    }
    double Base(double code) const {
        if (code < black) return slope * (code - black);
        return (std::pow(10.0, (code - white) * step) - offset) / (1.0 - offset);
    }
    double BaseInverse(double lin) const {
        if (lin < 0.0) return black + lin / slope;
        return white + std::log10(lin * (1.0 - offset) + offset) / step;
    }
    double ToLinear(double code) const {
        const double l = Base(code);
        if (knee >= 1.0 || l <= knee) return l;
        return knee + kneeWidth * (1.0 - std::exp(-(l - knee) / kneeWidth));
    }
    double FromLinear(double l) const {
        if (knee < 1.0 && l > knee) {
            // The knee never reaches 1: values at or above it come from far up the curve.
            const double rest = std::max(1.0 - (l - knee) / kneeWidth, 1e-12);
            l = knee - kneeWidth * std::log(rest);
        }
        return BaseInverse(l);
    }
};

/// Runs `f` over red, green and blue of `count` RGBA pixels.
template <class F> void Row(float *rgba, int count, F f) {
    for (int i = 0; i < count; ++i, rgba += 4)
        for (int c = 0; c < 3; ++c) rgba[c] = static_cast<float>(f(static_cast<double>(rgba[c])));
}

} // namespace gamutcurve

bool GamutCurve::IsIdentity() const {
    return space == GamutSpace::NoChange || space == GamutSpace::Linear || (space == GamutSpace::Gamma && gamma == 1.0);
}

double SRGBToLinear(double v) {
    return gamutcurve::Mirrored(v,
                                [](double x) { return x <= 0.04045 ? x / 12.92 : std::pow((x + 0.055) / 1.055, 2.4); });
}

double LinearToSRGB(double v) {
    return gamutcurve::Mirrored(
        v, [](double x) { return x <= 0.0031308 ? x * 12.92 : 1.055 * std::pow(x, 1.0 / 2.4) - 0.055; });
}

double Rec709ToLinear(double v) {
    using namespace gamutcurve;
    return Mirrored(v, [](double x) {
        return x < 4.5 * kRec709B ? x / 4.5 : std::pow((x + kRec709A - 1.0) / kRec709A, 1.0 / 0.45);
    });
}

double LinearToRec709(double v) {
    using namespace gamutcurve;
    return Mirrored(v,
                    [](double x) { return x < kRec709B ? 4.5 * x : kRec709A * std::pow(x, 0.45) - (kRec709A - 1.0); });
}

double GammaToLinear(double v, double gamma) {
    const double g = gamutcurve::SafeGamma(gamma);
    return gamutcurve::Mirrored(v, [g](double x) { return std::pow(x, g); });
}

double LinearToGamma(double v, double gamma) {
    const double g = 1.0 / gamutcurve::SafeGamma(gamma);
    return gamutcurve::Mirrored(v, [g](double x) { return std::pow(x, g); });
}

double CineonToLinear(double v, const CineonLogParams &p) { return gamutcurve::Cineon(p).ToLinear(v * 1023.0); }

double LinearToCineon(double v, const CineonLogParams &p) { return gamutcurve::Cineon(p).FromLinear(v) / 1023.0; }

double GamutToLinear(const GamutCurve &c, double v) {
    switch (c.space) {
    case GamutSpace::SRGB: return SRGBToLinear(v);
    case GamutSpace::Rec709: return Rec709ToLinear(v);
    case GamutSpace::Gamma: return GammaToLinear(v, c.gamma);
    case GamutSpace::CineonLog: return CineonToLinear(v, c.log);
    default: return v;
    }
}

double GamutFromLinear(const GamutCurve &c, double v) {
    switch (c.space) {
    case GamutSpace::SRGB: return LinearToSRGB(v);
    case GamutSpace::Rec709: return LinearToRec709(v);
    case GamutSpace::Gamma: return LinearToGamma(v, c.gamma);
    case GamutSpace::CineonLog: return LinearToCineon(v, c.log);
    default: return v;
    }
}

void GamutRowToLinear(const GamutCurve &c, float *rgba, int count) {
    using namespace gamutcurve;
    switch (c.space) {
    case GamutSpace::SRGB: Row(rgba, count, SRGBToLinear); break;
    case GamutSpace::Rec709: Row(rgba, count, Rec709ToLinear); break;
    case GamutSpace::Gamma: {
        const double g = c.gamma;
        Row(rgba, count, [g](double x) { return GammaToLinear(x, g); });
        break;
    }
    case GamutSpace::CineonLog: {
        const Cineon log(c.log);
        Row(rgba, count, [&log](double x) { return log.ToLinear(x * 1023.0); });
        break;
    }
    default: break;
    }
}

void GamutRowFromLinear(const GamutCurve &c, float *rgba, int count) {
    using namespace gamutcurve;
    switch (c.space) {
    case GamutSpace::SRGB: Row(rgba, count, LinearToSRGB); break;
    case GamutSpace::Rec709: Row(rgba, count, LinearToRec709); break;
    case GamutSpace::Gamma: {
        const double g = c.gamma;
        Row(rgba, count, [g](double x) { return LinearToGamma(x, g); });
        break;
    }
    case GamutSpace::CineonLog: {
        const Cineon log(c.log);
        Row(rgba, count, [&log](double x) { return log.FromLinear(x) / 1023.0; });
        break;
    }
    default: break;
    }
}

} // namespace Orvane
