#pragma once
// Parameter blocks of the keyers' first-matte kernels in the common library.
// Each kernel copies the source colour and writes the key into alpha; beyond
// the source's window the source is its canvas colour, whose result the tool
// works out once (defaultP, p) or whose colour it passes (sp). Windows are
// x0, x1, y0, y1; work items cover the output window.
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

// ChromaKeyer: the box of ranges on the axes red, green, blue and luminance
// (the chroma axes with key 0, plain colour with key 1), soft the soft range.
KROM_PARAM_STRUCT(ChromaKeyerParams, {
    float defaultP[4];
    float lowRGBL[4];
    float highRGBL[4];
    float soft;
    int key;
    int srcWindow[4];
    int dstWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(ChromaKeyerParams) == 104);
static_assert(offsetof(ChromaKeyerParams, srcCompOrder) == 96);
static_assert(offsetof(ChromaKeyerParams, dstCompOrder) == 100);

// LumaKey: the threshold key of one channel (0 blue, 1 green, 2 red, 3 alpha,
// 4 luminance, 5 saturation, 6 hue), diff = 1 / (high - low). The output
// window starts at (dstLeft, dstBottom).
KROM_PARAM_STRUCT(LumaKeyParams, {
    float p[4];
    float low, high, diff;
    int channelID;
    int srcWindow[4];
    int dstLeft, dstBottom;
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(LumaKeyParams) == 72);
static_assert(offsetof(LumaKeyParams, srcCompOrder) == 64);
static_assert(offsetof(LumaKeyParams, dstCompOrder) == 68);

// DifferenceKeyer: the threshold key of the largest colour difference between
// the input (sp beyond inDataWindow) and the foreground, which covers the
// output window; dif = 1 / (hi - lo).
KROM_PARAM_STRUCT(DifferenceKeyerParams, {
    float lo, hi, dif;
    float sp[4];
    int inDataWindow[4];
    int outDataWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(DifferenceKeyerParams) == 76);
static_assert(offsetof(DifferenceKeyerParams, srcCompOrder) == 68);
static_assert(offsetof(DifferenceKeyerParams, dstCompOrder) == 72);

} // namespace Orvane
