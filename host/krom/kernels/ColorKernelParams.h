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

namespace Orvane {

// CCProcessPixel / CCProcessPixelSimple: the Color Corrector's pixel function
// over its three range records. A colour matrix (CCColorMatrix) is 3 rows of
// 4 floats (3 by 3 and an offset); a simple one (CCColorMatrixSimple) is a
// multiplier and an offset per channel (4 + 4 floats). colorMat holds per
// record its low, high, below-black and above-white matrices (records 0..2),
// then the two global matrices into and out of the luma-first space;
// colorMatSimple holds per record levels 1 and levels 2; gamma per record R, G,
// B and one unused. doFlag: per record r, bits 4r + (0 matrix, 1 gamma,
// 2 levels 1, 3 levels 2). orderTintChannel: bit 0 gamma after levels, bits
// 1-2 the tint mode, bit 3 ranges in use. prePost: bit 0 pre-divide, bit 1
// post-multiply. The table image (width sampleWidth) holds the suppression
// factors of record r in row r, red (sampleCount[r] samples), and the range
// weights in row 3, red, green, blue (sampleCount[3] samples); the last row
// also holds the desaturation weights and offset in its alpha, samples 0..3.
// "CCProcessPixelSimple" is the same without suppression tables.
KROM_PARAM_STRUCT(CCProcessPixelParams, {
    float processCanvasColor[4];
    float gamma[12];
    float colorMat[14 * 12];
    float colorMatSimple[6 * 8];
    int doFlag;
    int orderTintChannel;
    int prePost;
    int hasSuppressionTable[3];
    int sampleCount[4];
    float invSampleHeight;
    int sampleWidth;
    int srcWindow[4];
    int dstWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(CCProcessPixelParams) == 1024);
static_assert(offsetof(CCProcessPixelParams, colorMat) == 64);
static_assert(offsetof(CCProcessPixelParams, colorMatSimple) == 736);
static_assert(offsetof(CCProcessPixelParams, doFlag) == 928);
static_assert(offsetof(CCProcessPixelParams, srcWindow) == 976);
static_assert(offsetof(CCProcessPixelParams, srcCompOrder) == 1016);
static_assert(offsetof(CCProcessPixelParams, dstCompOrder) == 1020);

// CCProcessRange: the range weights as a picture. defaultP is the processed
// canvas colour; selected the range shown (0 all three in R, G, B; 1..3 one as
// grey); channel is the channel the curves are edited on (not read here); the
// weights are row 0 of the table image (red, green, blue).
KROM_PARAM_STRUCT(CCProcessRangeParams, {
    float defaultP[4];
    int channel;
    int selected;
    int sampleCount;
    float invSampleHeight;
    int sampleWidth;
    int preDivide;
    int srcWindow[4];
    int dstWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(CCProcessRangeParams) == 88);
static_assert(offsetof(CCProcessRangeParams, srcCompOrder) == 80);
static_assert(offsetof(CCProcessRangeParams, dstCompOrder) == 84);

// CCProcessEqualize: the Color Corrector's histogram modes. colorMat holds
// the two global matrices into and out of the luma-first space (3 rows of 4
// floats each); the luma curve is read when histogramBlendL is above 0.
// preDivide: colour divided by alpha before and multiplied after. Values are
// taken as 16-bit (0..65535) and shifted down by `shift` to a bin; the table
// image holds bin k's curve values L, R, G, B (0..65535) as one RGBA float
// texel at (k % sampleWidth, k / sampleWidth), sampleCount bins in all.
KROM_PARAM_STRUCT(CCProcessEqualizeParams, {
    float processCanvasColor[4];
    float colorMat[2 * 12];
    float histogramBlendL;
    int preDivide;
    int shift;
    int sampleCount;
    int sampleWidth;
    int srcWindow[4];
    int dstWindow[4];
    int workSize[2];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(CCProcessEqualizeParams) == 180);
static_assert(offsetof(CCProcessEqualizeParams, colorMat) == 16);
static_assert(offsetof(CCProcessEqualizeParams, histogramBlendL) == 112);
static_assert(offsetof(CCProcessEqualizeParams, sampleCount) == 124);
static_assert(offsetof(CCProcessEqualizeParams, srcWindow) == 132);
static_assert(offsetof(CCProcessEqualizeParams, srcCompOrder) == 172);
static_assert(offsetof(CCProcessEqualizeParams, dstCompOrder) == 176);

} // namespace Orvane
