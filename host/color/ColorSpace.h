#pragma once
// Conversions between linear RGB and the spaces colours are blended in
// (gradients, colour tools): HLS, HSV and CIE L*a*b*.
//
// Conventions:
//  - RGB is linear light, nominally 0..1 per channel but never clamped.
//  - HLS and HSV triples are ordered as the names say: (H, L, S) and (H, S, V).
//    Hue is a fraction of a turn in [0, 1): 0 red, 1/3 green, 2/3 blue. A grey
//    has hue 0 and saturation 0. V is the largest channel, L the mean of the
//    largest and smallest; S is chroma (largest - smallest) over V, or for HLS
//    over 1 - |2L - 1|.
//  - Out-of-range RGB (negative, or above 1) converts with the same formulas
//    and converts back to itself, except where the saturation's denominator is
//    zero while the colour has chroma: HSV with a largest channel of exactly 0,
//    HLS with a lightness of exactly 0 or 1 (only reachable out of range).
//    Those colours have no form in the space; they convert to saturation 0
//    and so come back as a grey of the same V or L.
//  - LAB goes through CIE XYZ with the Rec.709 / sRGB primaries and the D65
//    white point, applied to the linear values directly (pixel values here
//    carry no transfer curve). L* is 0..100 for 0..1 luminance; RGB white
//    (1, 1, 1) is (100, 0, 0). Every finite RGB value round-trips.
//  - Converting back from HLS/HSV accepts any hue and wraps it into [0, 1).
//  - A ColorSpaceType outside the enum converts as RGB (a plain copy).
//
// Arithmetic is done in double and rounded to float once at the end.
// `in` and `out` may be the same array.
//
// Thread safety: pure functions on caller data; safe from any thread.
#include "host/core/Export.h"

namespace Orvane {

/// Interpolation spaces. The numbers are stored in documents: never renumber.
enum class ColorSpaceType : int { RGB = 0, HLS = 1, HSV = 5, LAB = 7 };

/// Linear RGB to `space`.
ORVANE_API void RGBToSpace(ColorSpaceType space, const float in[3], float out[3]);
/// `space` to linear RGB.
ORVANE_API void SpaceToRGB(ColorSpaceType space, const float in[3], float out[3]);
/// The same in double, for callers that round once themselves.
ORVANE_API void RGBToSpaceDouble(ColorSpaceType space, const double in[3], double out[3]);
ORVANE_API void SpaceToRGBDouble(ColorSpaceType space, const double in[3], double out[3]);

} // namespace Orvane
