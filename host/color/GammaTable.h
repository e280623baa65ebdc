#pragma once
// GammaTable: power-curve lookup for colour tools, y = scale * x^exponent.
//
// Float curve (InitTableFlt / LookupFlt):
//  - A table of kFloatSteps + 1 samples over [0, 1] (plus one guard entry so
//    x = 1 needs no special case), read with linear interpolation.
//  - Where linear interpolation between samples would be off by more than
//    kFloatTolerance (relative to scale), the power is computed directly
//    instead: near 0 for exponents below 2, where the curve bends sharply, and
//    near 1 for large exponents. Within [0, 1] the result is therefore within
//    kFloatTolerance * |scale| of the true curve, plus float rounding.
//  - Negative inputs and NaN read as 0 (a table clamps), so they give
//    scale * 0^exponent: 0, or scale for exponent 0.
//  - Inputs above 1 get the true power, so values over white keep their
//    shape; results beyond the float range are held at +-FLT_MAX.
//
// 16-bit curve (InitTable / Lookup): 65536 entries,
// round((v / 65535)^exponent * 65535).
//
// Exponents: 1 is the identity exactly (on [0, +inf) for floats, every value
// for 16-bit). 0 gives 1 everywhere, taking 0^0 = 1. Huge exponents (up to
// +inf) give the true, underflowing power: 0 well below 1, exactly 1 at 1,
// never NaN. A negative exponent is taken as 0 and NaN as 1: neither has a
// finite curve to tabulate.
//
// The `request` argument is not used yet; it is kept so that a long build can
// later poll the request for an abort.
//
// Lookups before the matching Init act as the identity curve (floats still
// clamp below 0).
//
// Thread safety: Init* modify the table and must not overlap with any other
// call; once built, lookups are const and safe from many threads at once.
#include <cstdint>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class ORVANE_API GammaTable {
public:
    static constexpr int kFloatSteps = 4096;
    static constexpr double kFloatTolerance = 1e-6;

    /// Builds the float curve scale * x^exponent.
    void InitTableFlt(const void *request, double scale, double exponent);
    float LookupFlt(float x) const {
        if (x >= tableLo_ && x <= tableHi_) {
            float f = x * kFloatSteps;
            int i = static_cast<int>(f);
            const float *t = flt_.data() + i;
            return t[0] + (t[1] - t[0]) * (f - i);
        }
        return LookupFltDirect(x);
    }

    /// Builds the 16-bit curve (v / 65535)^exponent * 65535.
    void InitTable(const void *request, double exponent);
    uint16_t Lookup(uint16_t v) const { return u16_.empty() ? v : u16_[v]; }

private:
    float LookupFltDirect(float x) const;

    std::vector<float> flt_; // kFloatSteps + 2 entries once built
    // Inputs in [tableLo_, tableHi_] read the table; empty until built.
    float tableLo_ = 1.0f, tableHi_ = 0.0f;
    double scale_ = 1.0, exponent_ = 1.0;
    std::vector<uint16_t> u16_;
};

} // namespace Orvane
