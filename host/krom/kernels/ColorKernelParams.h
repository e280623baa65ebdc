#pragma once
// Parameter blocks of the colour kernels of the common library. The tools
// fill them in; the kernels read them. Layouts are checked below, since the
// device compiler sees the same declaration as text.
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

// BrightnessContrast / BrightnessContrastReverse: the per-pixel chain of the
// Brightness / Contrast tool. dp is the processed canvas colour; windows are
// x0, x1, y0, y1.
KROM_PARAM_STRUCT(BrightnessContrastParams, {
    float dp[4];
    int chans[4];
    int prePost, doGamma, doSat, useLowHigh, clipBlack, clipWhite;
    float gain, gamma, lift, finalContrast, bright;
    float satMat_v1[4], satMat_v2[4], satMat_v3[4];
    float sat, _sat;
    float finalScale, low;
    int inDataWindow[4];
    int outDataWindow[4];
    int x0, x1;
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(BrightnessContrastParams) == 196);
static_assert(offsetof(BrightnessContrastParams, srcCompOrder) == 188);
static_assert(offsetof(BrightnessContrastParams, dstCompOrder) == 192);

// ColorMatrix: out = m x (r, g, b, a, 1), m four rows of five; the host's
// ApplyMatrixTagList.
KROM_PARAM_STRUCT(ColorMatrixParams, {
    float m[20];
    float dp[4];
    int inDataWindow[4];
    int outDataWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(ColorMatrixParams) == 144);

} // namespace Orvane
