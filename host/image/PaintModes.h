#pragma once
// Paint modes: how a mask M joins the mask I below it, scaled by a level l
// (docs/MASKS.md has the table). Every mode but None works as
//
//   out = clamp(I + l x (f(I, M) - I), 0, 1)
//
// with f the mode at full level, except Copy (l x M, I ignored) and None
// (I as it is, unclamped). Masks are coverages, so results are kept in 0..1.
//
// Thread safety: pure functions and constant tables.
#include "host/core/Export.h"

namespace Orvane {

enum PaintMode : int {
    PaintMerge = 0,    ///< union: I + M - I M
    PaintAdd = 1,      ///< I + M
    PaintSubtract = 2, ///< I - M
    PaintMinimum = 3,  ///< min(I, M): intersection
    PaintMaximum = 4,  ///< max(I, M)
    PaintAverage = 5,  ///< (I + M) / 2
    PaintMultiply = 6, ///< I M
    PaintReplace = 7,  ///< M
    PaintInvert = 8,   ///< I where M is 0, 1 - I where M is 1
    PaintCopy = 9,     ///< l M alone: the mode of a mask without one below it
    PaintNone = 10,    ///< I unchanged
};
constexpr int PaintModeCount = 11;

/// The labels users read and the IDs documents hold, by mode index.
ORVANE_API extern const char *const PaintModeName[PaintModeCount];
ORVANE_API extern const char *const PaintModeID[PaintModeCount];
/// The index of a paint mode ID (also by label); PaintMerge for an unknown one.
ORVANE_API int PaintModeIndex(const char *id);

/// One pixel: the incoming mask value `incoming` (I), the new mask value
/// `mask` (M), the level `level` (l). A mode out of range counts as Merge.
ORVANE_API float Merge_Flt32_Flt32_Pixel(int mode, float level, float incoming, float mask);

/// The same over n pixels, in place in `mask`; the mode is chosen once and the
/// loop is plain enough for the compiler to vectorise.
ORVANE_API void MergeSpanFlt32(int mode, float level, const float *incoming, float *mask, int n);

} // namespace Orvane
