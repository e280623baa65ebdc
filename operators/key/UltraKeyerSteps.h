#pragma once
// The pixel steps of the Ultra Keyer, each with a float form (float16 and
// float32 images) and a 16-bit form (int8 and int16 images, int8 widened to 16
// bits), rows on the worker pool, and a kernel of the common library that a
// render with a device runs first (the rows run when it fails):
//
//   DoUltraKeyer      the pre-matte: alpha 0 where a pixel's four axis values
//                     all lie in the ranges (PreMatteRanges), else 1
//   DoSoftUltraKeyer  the soft colour-difference matte against the background
//                     colour, with the separation rounds and the background
//                     taken off the colour (SoftPixel)
//   DoCombine         the soft matte cut by the pre-matte; the work image
//                     keeps the soft matte
//   DoSubtract        the colour follows a refined matte: restored toward the
//                     source where the matte grew, scaled down where it shrank
//
// The colour a step writes outside its inputs' data windows is their canvas
// colour through the same step, worked out once per call; each step sets its
// outputs' canvas colours that way. The float forms do the kernels'
// arithmetic in the kernels' order, so the two give the same bits on float
// images; on integer images the kernels work in float and the rows in fixed
// point, within a few codes of each other.
//
// Fixed point of the 16-bit forms: colours and alphas 0..65535; sat and satr
// times 1024; subSub and subMul times 65536; bgDiv times 65535; the weights
// times 65536; the background colour clamp(v x 65535, 0, 65535) truncated. A
// product of two 16-bit values rounds as (x + 32768 + ((x + 32768) >> 16)) >> 16.
//
// Thread safety: the steps may run on any thread, on images no other thread
// writes meanwhile; the values they read are not changed while they run.
#include <cstdint>

#include "host/image/Pixel.h"

namespace Orvane {

class Image;
class Request;

/// The controls the derived values come from.
struct UltraKeyerSettings {
    double background[3] = {0.5, 0.5, 0.5}; ///< red, green, blue of the screen
    double weight1 = 0.5, weight2 = 0.5;    ///< Red Level, Green Level
    double backgroundCorrection = 0.0;
    double matteSeparation = 0.0;
    bool subtractBackground = true;
};

/// The values of the soft matte, worked out once per render, in float (the
/// kernel's block fields) and in the 16-bit forms' fixed point.
struct UltraKeyerValues {
    float bgVal[3] = {0.5f, 0.5f, 0.5f};
    int vlColor = 0; ///< the key channel: 0 blue, 1 green, 2 red
    float bgScale[2] = {0.5f, 0.5f};
    float bgDiv = 0.f; ///< 0 exactly when the background has no colour difference
    float sat = 1.f, satr = 0.f;
    float correction = 0.f; ///< the separation total, 4 x Matte Separation
    int passes = 0;         ///< separation rounds, ceil(correction)
    bool sub = true;
    float subSub = 1.f, subMul = 0.f;

    // ---- 16-bit forms ----
    int32_t bg16[3] = {32767, 32767, 32767};
    int64_t scale16[2] = {32768, 32768};
    int64_t bgDiv16 = 0;
    int64_t sat1024 = 1024, satr1024 = 0;
    int64_t subSub16 = 65536, subMul16 = 0;
    int32_t roundT16[4] = {0, 0, 0, 0}; ///< t of each separation round
};

/// The derived values of `s`: the key channel is the background's largest
/// component, ties going to blue, then green.
UltraKeyerValues DeriveUltraKeyerValues(const UltraKeyerSettings &s);

/// The pre-matte box: low and high limits, inclusive, on four axes of a
/// colour: red (R - Y) 0.61035 + 0.5, green (G - Y) 0.76294 + 0.5, blue
/// (B - Y) 0.45776 + 0.5 and luminance Y = 0.299 R + 0.587 G + 0.114 B. The
/// 16-bit form takes Y = (19235 G + 9797 R + 3736 B) >> 15 and the axes
/// (((C - Y) k) >> 15) + 32768 with k = 20000, 25000, 15000, clamped to
/// 0..65535, against the limits times 65535 rounded. The default box holds
/// every colour.
struct PreMatteRanges {
    float low[4] = {0.f, 0.f, 0.f, 0.f};
    float high[4] = {1.f, 1.f, 1.f, 1.f};
    /// Every limit at its default (within 1.1920928955078125e-7): no pre-matte.
    bool AtDefaults() const;
};

/// The steps. `device`: try the step's kernel on the render's device first
/// (the caller has asked Operator::IsGPUEnabled). `dst` (and `work` of
/// DoCombine) get rows when the rows run; images written by rows lose their
/// device copies, which would be stale. False when the render was abandoned,
/// memory ran out or a device image could not be brought back.
///
/// DoUltraKeyer: dst := (src colour, pre-matte) over dst's data window.
bool DoUltraKeyer(Request *req, const Image *src, Image *dst, const PreMatteRanges &ranges, bool device);
/// DoSoftUltraKeyer: dst := the soft matte of src over dst's data window. Per
/// pixel: the test colour is C' = sat C - satr Y when satr is not 0, else C,
/// ordered by the key channel into c0 (the key), c1, c2 (blue: B, R, G; green:
/// G, R, B; red: R, G, B), the background likewise into b0, b1, b2;
///   raw = (c0 - (w1 c1 + w2 c2)) / bgDiv (0 when bgDiv is 0), a = 1 - clamp(raw, 0, 1);
///   `passes` rounds with t = min(1, s), s the separation left (from
///   correction): a' = a t + 1 - t, c := a' c + (1 - a') b, raw and a anew;
///   without sub the colour stays and alpha is a; with it m = raw subSub,
///   k = clamp(1 - m subMul, 0, 1), each source component
///   C := (C - min(max(bgC m, 0), C)) k, and alpha = clamp(max(a, R, G, B), 0, 1).
bool DoSoftUltraKeyer(Request *req, const Image *src, Image *dst, const UltraKeyerValues &v, bool device);
/// DoCombine: in place, dst alpha := dst alpha x work alpha and work alpha :=
/// dst's old alpha (beyond work's data window its canvas alpha is read and
/// nothing is kept).
bool DoCombine(Request *req, Image *work, Image *dst, bool device);
/// DoSubtract: in place, dst's colour C follows its matte a1 (dst's alpha)
/// against the old matte a0 (old's alpha), with S the source's colour (its
/// canvas beyond its window): where a1 > a0, C := min(C + (S - C) t, S) with
/// t = (a1 - a0) / (1 - a0) (1 when a0 >= 1); where a1 < a0, C := C a1 / a0
/// (0 when a0 is 0). `old` shares dst's data window.
bool DoSubtract(Request *req, const Image *src, Image *dst, const Image *old, bool device);

} // namespace Orvane
