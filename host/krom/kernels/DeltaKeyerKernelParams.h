#pragma once
// Parameter blocks of the Delta Keyer's kernels in the common library. Every
// kernel of the family is compiled with the text of all the blocks
// (DeltaKeyerParamsText), since the screen record is nested in the screen
// pass's block.
//
// Conventions: each kernel makes one output pixel per work item over
// `dstWindow` (x0, x1, y0, y1; the screen pass gives its corner as
// `dstLeftBtm`); an input pixel outside that input's window reads the
// block's value for it (the input's canvas colour, or a stand-in when the
// input is absent), so the kernel computes what the rows compute.
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

#define ORVANE_DK_TEXT(...) #__VA_ARGS__
#define ORVANE_DK_XTEXT(...) ORVANE_DK_TEXT(__VA_ARGS__)
#define ORVANE_DK_STRUCT(Name, Fields)                                                                                 \
    struct Name Fields;                                                                                                \
    inline constexpr char Name##Text[] = "typedef struct " ORVANE_DK_XTEXT(Fields) " " #Name ";\n";

// The screen record: how the key is measured against one background colour.
// Indices are channels 0 red, 1 green, 2 blue. The matte of a pixel p is
// (key - (midFactor p[mid] + lowFactor p[low])) x gain / d with
// d = offset x oneMinusFactors + denomBase (0 when d is 0); with `tuning`, key
// is first weighed by the three tonal gains through the curve table.
#define ORVANE_DK_SCREEN_INFO_FIELDS                                                                                   \
    {                                                                                                                  \
        float reference[3];                                                                                            \
        float background[3];                                                                                           \
        int lowIndex, keyIndex, midIndex;                                                                              \
        float denomBase;                                                                                               \
        float midFactor, lowFactor;                                                                                    \
        float gain;                                                                                                    \
        float oneMinusFactors;                                                                                         \
        float offset;                                                                                                  \
        int tuning;                                                                                                    \
        float shadowsGain, midtonesGain, highlightsGain;                                                               \
    }
ORVANE_DK_STRUCT(DeltaKeyerScreenInfoParams, ORVANE_DK_SCREEN_INFO_FIELDS)
static_assert(sizeof(DeltaKeyerScreenInfoParams) == 76);
static_assert(offsetof(DeltaKeyerScreenInfoParams, keyIndex) == 28);
static_assert(offsetof(DeltaKeyerScreenInfoParams, tuning) == 60);

// DeltaKeyerScreen: the colour and alpha records (equal when sameInfo), the
// curve table as an image `table` of ccTableWidth samples (shadows, midtones,
// highlights in red, green, blue), the clean plate when doClean.
#define ORVANE_DK_SCREEN_FIELDS                                                                                        \
    {                                                                                                                  \
        DeltaKeyerScreenInfoParams colorInfo;                                                                          \
        DeltaKeyerScreenInfoParams alphaInfo;                                                                          \
        int ccSampleCount, ccTableWidth;                                                                               \
        float ccInvSampleHeight;                                                                                       \
        int sameInfo, doClean;                                                                                         \
        float defaultP[4];                                                                                             \
        float defaultC[4];                                                                                             \
        int srcWindow[4];                                                                                              \
        int cleanWindow[4];                                                                                            \
        int dstLeftBtm[2];                                                                                             \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerScreenParams, ORVANE_DK_SCREEN_FIELDS)
static_assert(sizeof(DeltaKeyerScreenParams) == 260);
static_assert(offsetof(DeltaKeyerScreenParams, alphaInfo) == 76);
static_assert(offsetof(DeltaKeyerScreenParams, defaultP) == 172);
static_assert(offsetof(DeltaKeyerScreenParams, srcCompOrder) == 252);

// DeltaKeyerPreMatte: the four axes R, G, B, luminance against their ranges.
#define ORVANE_DK_PREMATTE_FIELDS                                                                                      \
    {                                                                                                                  \
        float defaultP[4];                                                                                             \
        float soft;                                                                                                    \
        float lowRGBL[4];                                                                                              \
        float highRGBL[4];                                                                                             \
        int srcWindow[4];                                                                                              \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerPreMatteParams, ORVANE_DK_PREMATTE_FIELDS)
static_assert(sizeof(DeltaKeyerPreMatteParams) == 100);
static_assert(offsetof(DeltaKeyerPreMatteParams, srcCompOrder) == 92);

// DeltaKeyerPreMatteCombine: source, pre-matte (`defaultM` beyond its
// window) and the other colour: the clean plate when doClean (defaultC beyond
// it), otherwise defaultC itself.
#define ORVANE_DK_PREMATTE_COMBINE_FIELDS                                                                              \
    {                                                                                                                  \
        float defaultP[4];                                                                                             \
        float defaultC[4];                                                                                             \
        float defaultM;                                                                                                \
        int doClean;                                                                                                   \
        int srcWindow[4];                                                                                              \
        int cleanWindow[4];                                                                                            \
        int matteWindow[4];                                                                                            \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerPreMatteCombineParams, ORVANE_DK_PREMATTE_COMBINE_FIELDS)
static_assert(sizeof(DeltaKeyerPreMatteCombineParams) == 120);
static_assert(offsetof(DeltaKeyerPreMatteCombineParams, srcCompOrder) == 112);

// DeltaKeyerThreshold: alpha through low..high.
#define ORVANE_DK_THRESHOLD_FIELDS                                                                                     \
    {                                                                                                                  \
        float defaultP[4];                                                                                             \
        float thresholdLow, thresholdHigh;                                                                             \
        int srcWindow[4];                                                                                              \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerThresholdParams, ORVANE_DK_THRESHOLD_FIELDS)
static_assert(sizeof(DeltaKeyerThresholdParams) == 72);
static_assert(offsetof(DeltaKeyerThresholdParams, srcCompOrder) == 64);

// DeltaKeyerRestoreFringe: the image (its colour kept), the soft alpha, and
// the eroded and dilated mattes, each absent one standing as its default.
#define ORVANE_DK_RESTORE_FRINGE_FIELDS                                                                                \
    {                                                                                                                  \
        int isErode, isDilate;                                                                                         \
        float defaultErode, defaultDilate;                                                                             \
        float defaultP[4];                                                                                             \
        float defaultSoft;                                                                                             \
        int srcWindow[4];                                                                                              \
        int softWindow[4];                                                                                             \
        int erodeWindow[4];                                                                                            \
        int dilateWindow[4];                                                                                           \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerRestoreFringeParams, ORVANE_DK_RESTORE_FRINGE_FIELDS)
static_assert(sizeof(DeltaKeyerRestoreFringeParams) == 132);
static_assert(offsetof(DeltaKeyerRestoreFringeParams, srcCompOrder) == 124);

// DeltaKeyerReplace: colour F (alpha kept) rebuilt from the source S, the
// alpha before (`preMatte` beyond its window) and after (`matte`) the matte
// stage; `replace` the replace colour, `mode` 0 None .. 3 Soft Color.
#define ORVANE_DK_REPLACE_FIELDS                                                                                       \
    {                                                                                                                  \
        float sp[4];                                                                                                   \
        float defaultF[4];                                                                                             \
        float preMatte, matte;                                                                                         \
        float replace[4];                                                                                              \
        int mode;                                                                                                      \
        int srcWindow[4];                                                                                              \
        int preWindow[4];                                                                                              \
        int matteWindow[4];                                                                                            \
        int colorWindow[4];                                                                                            \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerReplaceParams, ORVANE_DK_REPLACE_FIELDS)
static_assert(sizeof(DeltaKeyerReplaceParams) == 156);
static_assert(offsetof(DeltaKeyerReplaceParams, srcCompOrder) == 148);

// DeltaKeyerMaskMerge: the mask s (defaultS beyond its window, 1 - s with
// invertMask) merged into the destination's alpha d (defaultD is its canvas).
#define ORVANE_DK_MASK_MERGE_FIELDS                                                                                    \
    {                                                                                                                  \
        float defaultS;                                                                                                \
        float defaultD[4];                                                                                             \
        int isInvert, invertMask;                                                                                      \
        int maskWindow[4];                                                                                             \
        int srcWindow[4];                                                                                              \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerMaskMergeParams, ORVANE_DK_MASK_MERGE_FIELDS)
static_assert(sizeof(DeltaKeyerMaskMergeParams) == 92);
static_assert(offsetof(DeltaKeyerMaskMergeParams, srcCompOrder) == 84);

// DeltaKeyerColorMax: alpha raised to the key's alpha (defaultKey when the key
// is absent or beyond its window) and to the largest colour channel.
#define ORVANE_DK_COLOR_MAX_FIELDS                                                                                     \
    {                                                                                                                  \
        float defaultP[4];                                                                                             \
        float defaultKey;                                                                                              \
        int isKey;                                                                                                     \
        int srcWindow[4];                                                                                              \
        int keyWindow[4];                                                                                              \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerColorMaxParams, ORVANE_DK_COLOR_MAX_FIELDS)
static_assert(sizeof(DeltaKeyerColorMaxParams) == 88);
static_assert(offsetof(DeltaKeyerColorMaxParams, srcCompOrder) == 80);

/// The text of every block above, in order: what each Delta Keyer kernel is
/// compiled with.
inline constexpr char DeltaKeyerParamsText[] = "typedef struct " ORVANE_DK_XTEXT(
    ORVANE_DK_SCREEN_INFO_FIELDS) " DeltaKeyerScreenInfoParams;\n"
                                  "typedef struct " ORVANE_DK_XTEXT(
                                      ORVANE_DK_SCREEN_FIELDS) " DeltaKeyerScreenParams;\n"
                                                               "typedef struct " ORVANE_DK_XTEXT(
                                                                   ORVANE_DK_PREMATTE_FIELDS) " DeltaKeyerPreMatteParam"
                                                                                              "s;\n"
                                                                                              "typedef "
                                                                                              "struct " ORVANE_DK_XTEXT(
                                                                                                  ORVANE_DK_PREMATTE_COMBINE_FIELDS) " DeltaKeyerPreMatteCombineParams;\n"
                                                                                                                                     "typedef struct " ORVANE_DK_XTEXT(
                                                                                                                                         ORVANE_DK_THRESHOLD_FIELDS) " DeltaKeyerThresholdParams;\n"
                                                                                                                                                                     "typedef struct " ORVANE_DK_XTEXT(
                                                                                                                                                                         ORVANE_DK_RESTORE_FRINGE_FIELDS) " DeltaKeyerRestoreFringeParams;\n"
                                                                                                                                                                                                          "typedef struct " ORVANE_DK_XTEXT(
                                                                                                                                                                                                              ORVANE_DK_REPLACE_FIELDS) " DeltaKeyerReplaceParams;\n"
                                                                                                                                                                                                                                        "typedef struct " ORVANE_DK_XTEXT(
                                                                                                                                                                                                                                            ORVANE_DK_MASK_MERGE_FIELDS) " DeltaKeyerMaskMergeParams;\n"
                                                                                                                                                                                                                                                                         "typedef struct " ORVANE_DK_XTEXT(
                                                                                                                                                                                                                                                                             ORVANE_DK_COLOR_MAX_FIELDS) " DeltaKeyerColorMaxParams;\n";

} // namespace Orvane
