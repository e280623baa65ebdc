#include "host/color/GammaTable.h"

#include <algorithm>
#include <cfloat>
#include <cmath>

namespace Orvane {

namespace gammatable_impl {
namespace {

// The exponent actually used: negative powers have no finite value at 0 and
// are taken as 0; NaN is taken as 1.
double UsableExponent(double e) {
    if (std::isnan(e)) return 1.0;
    return e < 0.0 ? 0.0 : e;
}

// Largest gap between x^e and the straight line through its values at a and
// b = a + h. For a power curve the gap peaks where the slope equals the
// chord's, at x = (s / e)^(1 / (e - 1)); the midpoint is checked too, for
// exponents where that formula degenerates (near 1, or infinite).
double ChordError(double a, double h, double e, double fa, double fb) {
    auto gap = [&](double x) { return std::fabs(fa + (fb - fa) * ((x - a) / h) - std::pow(x, e)); };
    double err = gap(a + 0.5 * h);
    double s = (fb - fa) / h;
    if (e != 1.0 && e > 0.0 && s > 0.0 && std::isfinite(e)) {
        double x = std::pow(s / e, 1.0 / (e - 1.0));
        if (x > a && x < a + h) err = std::max(err, gap(x));
    }
    return err;
}

float ToFloatHeld(double v) {
    if (v > FLT_MAX) return FLT_MAX;
    if (v < -FLT_MAX) return -FLT_MAX;
    return static_cast<float>(v);
}

} // namespace
} // namespace gammatable_impl

void GammaTable::InitTableFlt([[maybe_unused]] const void *request, double scale, double exponent) {
    const double e = gammatable_impl::UsableExponent(exponent);
    const double h = 1.0 / kFloatSteps;
    scale_ = scale;
    exponent_ = e;

    std::vector<double> curve(kFloatSteps + 1);
    for (int i = 0; i <= kFloatSteps; ++i) curve[i] = std::pow(i * h, e);

    // Intervals whose chord strays from the curve by more than the tolerance
    // are left to the direct path. The stray ones sit at one end: the low end
    // for exponents below 2 (the curve bends most near 0), the high end above.
    int firstBad = -1, lastBad = -1;
    for (int i = 0; i < kFloatSteps; ++i) {
        if (gammatable_impl::ChordError(i * h, h, e, curve[i], curve[i + 1]) > kFloatTolerance) {
            if (firstBad < 0) firstBad = i;
            lastBad = i;
        }
    }
    int lo = 0, hi = kFloatSteps;
    if (firstBad >= 0) {
        if (e < 2.0)
            lo = lastBad + 1;
        else
            hi = firstBad;
    }

    flt_.resize(kFloatSteps + 2);
    for (int i = 0; i <= kFloatSteps; ++i) flt_[i] = gammatable_impl::ToFloatHeld(scale * curve[i]);
    flt_[kFloatSteps + 1] = flt_[kFloatSteps];
    if (lo < hi) {
        tableLo_ = static_cast<float>(lo * h);
        tableHi_ = static_cast<float>(hi * h);
    } else {
        tableLo_ = 1.0f, tableHi_ = 0.0f;
    }
}

float GammaTable::LookupFltDirect(float x) const {
    double v = x > 0.0f ? static_cast<double>(x) : 0.0; // negatives and NaN read as 0
    return gammatable_impl::ToFloatHeld(scale_ * std::pow(v, exponent_));
}

void GammaTable::InitTable([[maybe_unused]] const void *request, double exponent) {
    const double e = gammatable_impl::UsableExponent(exponent);
    u16_.resize(65536);
    for (int v = 0; v < 65536; ++v) {
        double y = std::pow(v / 65535.0, e) * 65535.0;
        u16_[v] = static_cast<uint16_t>(std::clamp(std::floor(y + 0.5), 0.0, 65535.0));
    }
}

} // namespace Orvane
