#pragma once
// The parameter block of the resize kernels of the common library
// ("ResizeAcross", "ResizeDown"), which run the host's separable resampler
// (Resample.h) on a device. Windows are x0, x1, y0, y1.
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

// canvas: the source's canvas colour. srcWindow: the source's data window
// (empty when it has no pixels). rangeX, rangeY: the source ranges [lo, hi)
// the edge policies work on; edges: their EdgeMode (x, y), -1 for a range the
// taps never leave. tapsX, tapsY: taps per output sample. rowsY0: the source
// row (before the y edge policy) held in row 0 of the image filtered across.
// acrossSize: that image's width and height; workSize: the output's.
KROM_PARAM_STRUCT(ResizeParams, {
    float canvas[4];
    int srcWindow[4];
    int rangeX[2];
    int rangeY[2];
    int edges[2];
    int tapsX, tapsY;
    int rowsY0;
    int acrossSize[2];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(ResizeParams) == 92);
static_assert(offsetof(ResizeParams, srcCompOrder) == 84);
static_assert(offsetof(ResizeParams, dstCompOrder) == 88);

} // namespace Orvane
