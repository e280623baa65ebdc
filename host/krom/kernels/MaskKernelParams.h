#pragma once
// Parameter block of the "MaskMerge" kernel of the common library: a mask
// merged in place with the incoming mask below it by a paint mode
// (host/image/PaintModes.h). The mask and the output share `maskWindow`; the
// incoming mask has `inWindow` and the canvas value `inCanvas` beyond it.
// Windows are x0, x1, y0, y1.
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

KROM_PARAM_STRUCT(MaskMergeParams, {
    int mode;
    float level;
    float inCanvas;
    int maskWindow[4];
    int inWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(MaskMergeParams) == 60);
static_assert(offsetof(MaskMergeParams, srcCompOrder) == 52);
static_assert(offsetof(MaskMergeParams, dstCompOrder) == 56);

} // namespace Orvane
