#pragma once
// Parameter blocks of the blur kernels of the common library (the host's
// Image::BlurTagList). Windows are x0, x1, y0, y1.
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

// BlurRows: the across pass. Output texel (x, y) is position
// (outWindow[0] + x, outWindow[2] + y); it sums weights[k] times the source at
// x - radius + k, where the source is the input's pixel inside haveWindow
// (its data window and the blur's source window) and the canvas elsewhere.
KROM_PARAM_STRUCT(BlurRowsParams, {
    float canvas[4];
    int haveWindow[4];
    int inDataWindow[4];
    int outWindow[4];
    int radius;
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(BlurRowsParams) == 84);
static_assert(offsetof(BlurRowsParams, srcCompOrder) == 76);

// BlurColumns: the down pass over the across pass's rows (tmpWindow; the
// canvas beyond them), then scale, blend and channel switches against the
// input's own pixel, stored in the output's depth.
KROM_PARAM_STRUCT(BlurColumnsParams, {
    float canvas[4];
    float scale[4];
    float blend;
    int chans[4];
    int tmpWindow[4];
    int inDataWindow[4];
    int outWindow[4];
    int radius;
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(BlurColumnsParams) == 120);
static_assert(offsetof(BlurColumnsParams, srcCompOrder) == 112);

} // namespace Orvane
