#pragma once
// Transfer curves between the encodings files store and linear light: the
// pure functions behind GamutInputs (host/flow/GamutInputs.h).
//
// Values are image values: 0..1 for black to white (integer codes over
// their maximum); a Cineon log value v stands for the 10-bit code v * 1023.
// Every curve is defined on the whole real line and every pair inverts:
//   sRGB      IEC 61966-2-1: v / 12.92 up to 0.04045, else ((v + 0.055) / 1.055)^2.4
//   Rec.709   the BT.709 camera curve 4.5 L below b, a L^0.45 - (a - 1) above,
//             with the unrounded a = 1.0992968, b = 0.0180540 at which the two
//             pieces meet (the rounded 1.099 and 0.018 leave a small step, and
//             values in it would not come back)
//   Gamma     a plain power: linear = v^gamma
// these three mirror negative values (f(-v) = -f(v)), so float images keep
// their below-black values and the curves stay invertible;
//   Cineon    printing-density log: linear = (10^((c - white) d) - o) / (1 - o)
//             with c the code value, d = 0.002 / film gamma (density per code
//             value over the film gamma), o = 10^((black - white) d), so black
//             gives 0 and white 1. Below the black code the curve goes on as a
//             straight line with the slope it has at black (noise below black
//             stays small and invertible). An optional soft clip rolls the
//             linear values above the code white - softClip off toward 1 along
//             an exponential, so highlights above white never exceed 1.
// Linear and No Change are the identity.
//
// Arithmetic is in double; row functions round to float once per value.
//
// Thread safety: pure functions.
#include "host/core/Export.h"

namespace Orvane {

/// Encodings. The numbers are stable (tools may store them). ConfigSpace is a
/// colour space of the colour configuration (host/color/ColorConfig.h), which
/// GamutInputs converts; the curve functions below leave its values alone.
enum class GamutSpace : int {
    NoChange = 0,
    Linear = 1,
    SRGB = 2,
    Rec709 = 3,
    Gamma = 4,
    CineonLog = 5,
    ConfigSpace = 6
};

struct CineonLogParams {
    double black = 95.0;    ///< code value of black (linear 0)
    double white = 685.0;   ///< code value of white (linear 1)
    double filmGamma = 0.6; ///< the negative's gamma; density is 0.002 per code value
    double softClip = 0.0;  ///< code values below white where highlights start to roll off; 0: none
};

/// One encoding with its settings.
struct ORVANE_API GamutCurve {
    GamutSpace space = GamutSpace::NoChange;
    double gamma = 2.2;
    CineonLogParams log;
    /// True when converting changes nothing (No Change, Linear, a gamma of exactly 1).
    bool IsIdentity() const;
};

ORVANE_API double SRGBToLinear(double v);
ORVANE_API double LinearToSRGB(double v);
ORVANE_API double Rec709ToLinear(double v);
ORVANE_API double LinearToRec709(double v);
/// Gamma values at or below 0.01 (or not finite) count as 0.01 and 1.
ORVANE_API double GammaToLinear(double v, double gamma);
ORVANE_API double LinearToGamma(double v, double gamma);
/// `v` is the code value over 1023. White at or below black counts as black + 1.
ORVANE_API double CineonToLinear(double v, const CineonLogParams &p);
ORVANE_API double LinearToCineon(double v, const CineonLogParams &p);

/// The curve of `c` from its encoding to linear, and back.
ORVANE_API double GamutToLinear(const GamutCurve &c, double v);
ORVANE_API double GamutFromLinear(const GamutCurve &c, double v);

/// Converts red, green and blue of `count` RGBA float pixels in place; alpha
/// is left alone. The curve is chosen once per call.
ORVANE_API void GamutRowToLinear(const GamutCurve &c, float *rgba, int count);
ORVANE_API void GamutRowFromLinear(const GamutCurve &c, float *rgba, int count);

} // namespace Orvane
