#pragma once
// Parameter blocks of the generator kernels of the common library.
// imgDataWindow is left, right, bottom, top; imgSize holds width - 1 and
// height - 1 of the image; dstCompOrder is 8 for a mask and 15 otherwise.
#include "host/krom/KROMParams.h"

namespace Orvane {

// Background: flat colour, horizontal, vertical and four-corner ramps.
KROM_PARAM_STRUCT(BackgroundParams, {
    int mode;
    float tl[4], tr[4], bl[4], br[4];
    int imgDataWindow[4];
    int imgSize[2];
    int workSize[2];
    int dstCompOrder;
})
static_assert(sizeof(BackgroundParams) == 104);

// BackgroundGrad: a gradient along start..end, read from a 256 x 1 table.
KROM_PARAM_STRUCT(BackgroundGradParams, {
    float start[2], end[2];
    float offset, aspect;
    int type, repeat, subpixel;
    int imgDataWindow[4];
    int imgSize[2];
    int workSize[2];
    int dstCompOrder;
})
static_assert(sizeof(BackgroundGradParams) == 72);

} // namespace Orvane
