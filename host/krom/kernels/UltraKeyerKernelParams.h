#pragma once
// Parameter blocks of the keyer kernels of the common library (the pre-matte,
// the soft colour-difference matte, and the two steps that join them). The
// keyer fills them in; the kernels read them. Windows are x0, x1, y0, y1:
// `inDataWindow` is the window of the image read with the canvas colour
// beyond it, `outDataWindow` the output's. Layouts are checked below, since the
// device compiler sees the same declaration as text.
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

// UltraKeyer: the pre-matte. dp is the result for the input's canvas colour;
// the limits are the box on the four axes, inclusive at both ends.
KROM_PARAM_STRUCT(UltraKeyerParams, {
    float dp[4];
    float lowR, highR, lowG, highG, lowB, highB, lowLum, highLum;
    int inDataWindow[4];
    int outDataWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(UltraKeyerParams) == 96);
static_assert(offsetof(UltraKeyerParams, lowR) == 16);
static_assert(offsetof(UltraKeyerParams, inDataWindow) == 48);
static_assert(offsetof(UltraKeyerParams, srcCompOrder) == 88);
static_assert(offsetof(UltraKeyerParams, dstCompOrder) == 92);

// UltraKeyerSoft: the soft matte. bgVal is the background colour (red, green,
// blue); vlColor the key channel (0 blue, 1 green, 2 red); bgScale the two
// weights; sub 1 when the background is taken off the colour; passes the
// separation rounds, correction the separation they share out.
KROM_PARAM_STRUCT(UltraKeyerSoftParams, {
    float dp[4];
    float bgVal[3];
    float sat, satr, correction;
    int vlColor;
    float bgScale[2];
    float bgDiv;
    int sub;
    float subSub, subMul;
    int passes;
    int inDataWindow[4];
    int outDataWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(UltraKeyerSoftParams) == 120);
static_assert(offsetof(UltraKeyerSoftParams, bgVal) == 16);
static_assert(offsetof(UltraKeyerSoftParams, vlColor) == 40);
static_assert(offsetof(UltraKeyerSoftParams, bgDiv) == 52);
static_assert(offsetof(UltraKeyerSoftParams, passes) == 68);
static_assert(offsetof(UltraKeyerSoftParams, inDataWindow) == 72);
static_assert(offsetof(UltraKeyerSoftParams, srcCompOrder) == 112);
static_assert(offsetof(UltraKeyerSoftParams, dstCompOrder) == 116);

// UltraKeyerCombine: the matte ("input", written to "output") cut by the work
// image's alpha ("work", its window inDataWindow, alpha spw beyond it), and
// the matte's old alpha kept in the work image ("outputWork"). The matte, both
// outputs and the work image share the depth; the outputs the matte's window.
KROM_PARAM_STRUCT(UltraKeyerCombineParams, {
    float spw;
    int inDataWindow[4];
    int outDataWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(UltraKeyerCombineParams) == 52);
static_assert(offsetof(UltraKeyerCombineParams, srcCompOrder) == 44);
static_assert(offsetof(UltraKeyerCombineParams, dstCompOrder) == 48);

// UltraKeyerSubtract: the colour of "input" (written to "output") follows the
// change of its matte against the old one ("old"), toward the source ("src",
// window inDataWindow, colour sp beyond it). "input", "old" and the output
// share the depth and the window outDataWindow; srcCompOrder is the source's.
KROM_PARAM_STRUCT(UltraKeyerSubtractParams, {
    float sp[4];
    int inDataWindow[4];
    int outDataWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(UltraKeyerSubtractParams) == 64);
static_assert(offsetof(UltraKeyerSubtractParams, srcCompOrder) == 56);
static_assert(offsetof(UltraKeyerSubtractParams, dstCompOrder) == 60);

} // namespace Orvane
