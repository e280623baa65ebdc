#pragma once
// Parameter block of the "Merge" kernel of the common library: a foreground
// laid onto a background (host/image/MergeModes.h). The constants are those
// of MergeSettings (hc, kk, fa, blend); windows are x0, x1, y0, y1; the
// foreground's pixel (i, j) lies at (i + fgOffset[0], j + fgOffset[1]).
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

KROM_PARAM_STRUCT(MergeParams, {
    int mode, op;
    float hc, kk, fa, blend;
    int doBlend;
    int chans[4];
    float fgCanvas[4];
    float bgCanvas[4];
    int fgWindow[4];
    int bgWindow[4];
    int outWindow[4];
    int fgOffset[2];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(MergeParams) == 148);
static_assert(offsetof(MergeParams, srcCompOrder) == 140);
static_assert(offsetof(MergeParams, dstCompOrder) == 144);

} // namespace Orvane
