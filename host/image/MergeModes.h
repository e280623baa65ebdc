#pragma once
// The pixel formulas of compositing: a foreground laid onto a background,
// both premultiplied, by an apply mode (Normal, Screen, Multiply, ...), for
// Normal by a Porter-Duff operator (Over, In, Held Out, Atop, XOr), with the
// blend, subtractive/additive, alpha gain and burn-in controls, per-channel
// choices and the depth (Z) merge. docs/MERGE.md gives every formula; the
// code below follows it term by term and in the same order, so the device
// kernel ("Merge", host/krom/kernels/MergeKernels.cpp) gets the same bits.
//
//   MergeSettings          the controls, read once per call (FromTags)
//   MergePixel             one pixel (tests, the canvas colour, slow paths)
//   MergeCanvasColor       the canvas of the result: the formula on the two
//                          canvases (Dissolve: its mean)
//   MergeDataWindow        where the result can differ from that canvas
//   MergeImagesTagList     the whole job over the destination's data window:
//                          all 8 depths (rows in float, integers rounded and
//                          clamped on the way out), rows in parallel, the
//                          device kernel when the tags allow it
//
// Thread safety: pure functions; MergeImagesTagList writes only `dst` (its
// rows on the workers, each row by one of them).
#include <cstdint>

#include "host/core/TagList.h"
#include "host/image/Pixel.h"
#include "host/image/Rect.h"

namespace Orvane {

class Image;

/// The apply modes, in the order of the control's list.
enum MergeApplyMode : int {
    MrgNormal = 0,
    MrgScreen,
    MrgDissolve,
    MrgMultiply,
    MrgOverlay,
    MrgSoftLight,
    MrgHardLight,
    MrgColorDodge,
    MrgColorBurn,
    MrgDarken,
    MrgLighten,
    MrgDifference,
    MrgExclusion,
    MrgHue,
    MrgSaturation,
    MrgColor,
    MrgLuminosity,
    MrgAdd,
    MrgSubtract,
    MrgModeCount
};

/// The operators of the Normal mode.
enum MergeOperatorType : int { MrgOver = 0, MrgIn, MrgHeldOut, MrgAtop, MrgXOr, MrgOperatorCount };
/// An operator outside the list: the foreground replaces the background
/// (co = cs, ao = fa as). With Blend and the channel choices it mixes a
/// merged stack back over its unmerged background.
constexpr int MrgReplace = MrgOperatorCount;

struct ORVANE_API MergeSettings {
    int mode = MrgNormal;
    int op = MrgOver;
    float blend = 1.f;     ///< 0: the background; 1: the full merge
    float additive = 0.f;  ///< 0: the foreground's alpha holds the background out; 1: it does not
    float alphaGain = 1.f; ///< scales what the foreground adds to the alpha
    float burnIn = 0.f;    ///< 1: the foreground is light printed onto the background (no coverage)
    bool channels[4] = {true, true, true, true};
    bool zMerge = false;
    bool zLargerIsNearer = false;

    /// From the merge request's tags (Tags.h, Mrg*); out-of-range choices
    /// fall back to Normal / Over.
    static MergeSettings FromTags(const TagList &tags);
    /// The constants of the formulas: hc = (1 - additive)(1 - burnIn)
    /// scales the foreground alpha that holds the background's colour out,
    /// kk = 1 - burnIn the one that holds its alpha out, fa = alphaGain kk
    /// the foreground alpha's share of the result's alpha.
    float Hc() const { return (1.f - additive) * (1.f - burnIn); }
    float Kk() const { return 1.f - burnIn; }
    float Fa() const { return alphaGain * (1.f - burnIn); }
    bool AllChannels() const { return channels[0] && channels[1] && channels[2] && channels[3]; }
    /// A clear foreground (all zero) leaves every background pixel as it
    /// is: true for all but Normal In, Held Out and Replace.
    bool ClearForegroundKeepsBackground() const;
};

/// The dissolve noise at pixel (x, y): a value in [0, 1) from an integer
/// hash of the position (docs/MERGE.md), the same on every run and device.
ORVANE_API float DissolveNoise(int x, int y);

/// One merged pixel at position (x, y) (used by Dissolve only).
ORVANE_API FltPixel MergePixel(const MergeSettings &s, const FltPixel &fg, const FltPixel &bg, int x, int y);
/// The same with depth: zf and zb are the two Z values (use MergeFarZ(s) for
/// "no Z here"); zOut receives the winner's Z. Without zMerge in `s` this is
/// MergePixel and zOut is zb.
ORVANE_API FltPixel MergePixelZ(const MergeSettings &s, const FltPixel &fg, const FltPixel &bg, float zf, float zb,
                                int x, int y, float &zOut);
/// The Z that is never nearer than any other.
ORVANE_API float MergeFarZ(const MergeSettings &s);
/// The canvas of the result, from the foreground's and background's.
ORVANE_API FltPixel MergeCanvasColor(const MergeSettings &s, const FltPixel &fgCanvas, const FltPixel &bgCanvas);
/// The data window of the result: the union of the two windows (the
/// foreground's already placed), less the parts where the result equals
/// MergeCanvasColor whatever the pixels are: beyond the background's window
/// for Normal In and Atop over a clear background canvas, beyond the
/// foreground's for Normal In and Held Out under a clear foreground canvas
/// (full blend, every channel, no depth merge).
ORVANE_API ImgRectI MergeDataWindow(const MergeSettings &s, const ImgRectI &fgWindow, const FltPixel &fgCanvas,
                                    const ImgRectI &bgWindow, const FltPixel &bgCanvas);

/// Merges `fg` onto `bg` into `dst` over dst's data window (its rows are
/// allocated here; an image without data only gets its canvas). dst's canvas
/// becomes MergeCanvasColor. Outside an image's data window its canvas colour
/// counts. Auxiliary planes of the background are carried into dst (its Z
/// replaced by the winner's under the depth merge); the foreground's are not.
/// Tags: the merge request (Mrg*), MrgFgOffsetX/Y, WorkRequest (abort;
/// device), WorkUseGPU (try the "Merge" kernel first), WorkThreaded.
/// False on abort, when memory ran out, or for a missing image.
ORVANE_API bool MergeImagesTagList(const Image *fg, const Image *bg, Image *dst, const TagList &tags);

/// Whether the device kernel does these settings (the rows do everything).
ORVANE_API bool MergeKernelSupports(const MergeSettings &s);

} // namespace Orvane
