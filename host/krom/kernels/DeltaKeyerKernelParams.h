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
#define ORVANE_DK_TYPEDEF(Name, ...) "typedef struct " ORVANE_DK_XTEXT(__VA_ARGS__) " " #Name ";\n"
#define ORVANE_DK_STRUCT(Name, ...) struct Name __VA_ARGS__;

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

// DeltaKeyerReplaceMask: the replace rule for the solid matte: a0 from
// `before` (`key` beyond it), a1 the alpha of the colour image, only where the
// mask (`mask` beyond it; 1 - mask with isInvert) is above 0.
#define ORVANE_DK_REPLACE_MASK_FIELDS                                                                                  \
    {                                                                                                                  \
        float sp[4];                                                                                                   \
        float defaultF[4];                                                                                             \
        float key, mask;                                                                                               \
        float colors[4];                                                                                               \
        int isInvert, mode;                                                                                            \
        int srcWindow[4];                                                                                              \
        int preWindow[4];                                                                                              \
        int maskWindow[4];                                                                                             \
        int colorWindow[4];                                                                                            \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerReplaceMaskParams, ORVANE_DK_REPLACE_MASK_FIELDS)
static_assert(sizeof(DeltaKeyerReplaceMaskParams) == 160);
static_assert(offsetof(DeltaKeyerReplaceMaskParams, srcCompOrder) == 152);

// DeltaKeyerStatusDiff: after minus before, the alphas (`matte` and `preMatte`
// beyond their windows), in all four channels.
#define ORVANE_DK_STATUS_DIFF_FIELDS                                                                                   \
    {                                                                                                                  \
        float preMatte, matte;                                                                                         \
        int preWindow[4];                                                                                              \
        int matteWindow[4];                                                                                            \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerStatusDiffParams, ORVANE_DK_STATUS_DIFF_FIELDS)
static_assert(sizeof(DeltaKeyerStatusDiffParams) == 72);
static_assert(offsetof(DeltaKeyerStatusDiffParams, srcCompOrder) == 64);

// DeltaKeyerStatus: the state of the alpha as grey, tinted by the diff's alpha
// (`diff` beyond its window) when isDiff.
#define ORVANE_DK_STATUS_FIELDS                                                                                        \
    {                                                                                                                  \
        float defaultP[4];                                                                                             \
        int isDiff, isInvert;                                                                                          \
        float diff;                                                                                                    \
        int srcWindow[4];                                                                                              \
        int diffWindow[4];                                                                                             \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerStatusParams, ORVANE_DK_STATUS_FIELDS)
static_assert(sizeof(DeltaKeyerStatusParams) == 92);
static_assert(offsetof(DeltaKeyerStatusParams, srcCompOrder) == 84);

// DeltaKeyerStatusSolid and DeltaKeyerStatusGarbage: the tint where a mask
// (`mask` beyond its window, 1 - mask with isInvert) adds to or takes from alpha.
#define ORVANE_DK_STATUS_MASK_FIELDS                                                                                   \
    {                                                                                                                  \
        float defaultP[4];                                                                                             \
        int isInvert;                                                                                                  \
        float mask;                                                                                                    \
        int srcWindow[4];                                                                                              \
        int maskWindow[4];                                                                                             \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerStatusSolidParams, ORVANE_DK_STATUS_MASK_FIELDS)
ORVANE_DK_STRUCT(DeltaKeyerStatusGarbageParams, ORVANE_DK_STATUS_MASK_FIELDS)
static_assert(sizeof(DeltaKeyerStatusSolidParams) == 88 && sizeof(DeltaKeyerStatusGarbageParams) == 88);
static_assert(offsetof(DeltaKeyerStatusSolidParams, srcCompOrder) == 80);

// DeltaKeyerRangesToColor: the curve table (image `table`, ccTableWidth
// samples) at the max of the first maxChannels channels.
#define ORVANE_DK_RANGES_TO_COLOR_FIELDS                                                                               \
    {                                                                                                                  \
        float defaultP[4];                                                                                             \
        int ccSampleCount, ccTableWidth;                                                                               \
        float ccInvSampleHeight;                                                                                       \
        int maxChannels;                                                                                               \
        int srcWindow[4];                                                                                              \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerRangesToColorParams, ORVANE_DK_RANGES_TO_COLOR_FIELDS)
static_assert(sizeof(DeltaKeyerRangesToColorParams) == 80);
static_assert(offsetof(DeltaKeyerRangesToColorParams, srcCompOrder) == 72);

// DeltaKeyerAlphaToColor: the source's alpha (`alpha` beyond its window) as grey.
#define ORVANE_DK_ALPHA_TO_COLOR_FIELDS                                                                                \
    {                                                                                                                  \
        float alpha;                                                                                                   \
        int isInvert;                                                                                                  \
        int srcWindow[4];                                                                                              \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerAlphaToColorParams, ORVANE_DK_ALPHA_TO_COLOR_FIELDS)
static_assert(sizeof(DeltaKeyerAlphaToColorParams) == 56);
static_assert(offsetof(DeltaKeyerAlphaToColorParams, srcCompOrder) == 48);

// DeltaKeyerCopyColor: the source's colour with the destination's alpha.
#define ORVANE_DK_COPY_COLOR_FIELDS                                                                                    \
    {                                                                                                                  \
        float defaultP[4];                                                                                             \
        float defaultD[4];                                                                                             \
        int srcWindow[4];                                                                                              \
        int colorWindow[4];                                                                                            \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerCopyColorParams, ORVANE_DK_COPY_COLOR_FIELDS)
static_assert(sizeof(DeltaKeyerCopyColorParams) == 96);
static_assert(offsetof(DeltaKeyerCopyColorParams, srcCompOrder) == 88);

// DeltaKeyerSourceAlpha: mode 0 shows the source's alpha (`alpha` beyond its
// window) as grey; mode 1 scales the destination by 1 - that alpha.
#define ORVANE_DK_SOURCE_ALPHA_FIELDS                                                                                  \
    {                                                                                                                  \
        float alpha;                                                                                                   \
        int mode;                                                                                                      \
        float defaultD[4];                                                                                             \
        int srcWindow[4];                                                                                              \
        int colorWindow[4];                                                                                            \
        int dstWindow[4];                                                                                              \
        int workSize[2];                                                                                               \
        int srcCompOrder, dstCompOrder;                                                                                \
    }
ORVANE_DK_STRUCT(DeltaKeyerSourceAlphaParams, ORVANE_DK_SOURCE_ALPHA_FIELDS)
static_assert(sizeof(DeltaKeyerSourceAlphaParams) == 88);
static_assert(offsetof(DeltaKeyerSourceAlphaParams, srcCompOrder) == 80);

/// The text of every block above, in order: what each Delta Keyer kernel is
/// compiled with.
// clang-format off
inline constexpr char DeltaKeyerParamsText[] =
    ORVANE_DK_TYPEDEF(DeltaKeyerScreenInfoParams, ORVANE_DK_SCREEN_INFO_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerScreenParams, ORVANE_DK_SCREEN_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerPreMatteParams, ORVANE_DK_PREMATTE_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerPreMatteCombineParams, ORVANE_DK_PREMATTE_COMBINE_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerThresholdParams, ORVANE_DK_THRESHOLD_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerRestoreFringeParams, ORVANE_DK_RESTORE_FRINGE_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerReplaceParams, ORVANE_DK_REPLACE_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerMaskMergeParams, ORVANE_DK_MASK_MERGE_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerColorMaxParams, ORVANE_DK_COLOR_MAX_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerReplaceMaskParams, ORVANE_DK_REPLACE_MASK_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerStatusDiffParams, ORVANE_DK_STATUS_DIFF_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerStatusParams, ORVANE_DK_STATUS_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerStatusSolidParams, ORVANE_DK_STATUS_MASK_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerStatusGarbageParams, ORVANE_DK_STATUS_MASK_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerRangesToColorParams, ORVANE_DK_RANGES_TO_COLOR_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerAlphaToColorParams, ORVANE_DK_ALPHA_TO_COLOR_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerCopyColorParams, ORVANE_DK_COPY_COLOR_FIELDS)
    ORVANE_DK_TYPEDEF(DeltaKeyerSourceAlphaParams, ORVANE_DK_SOURCE_ALPHA_FIELDS);
// clang-format on

} // namespace Orvane
