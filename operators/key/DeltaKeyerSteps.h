#pragma once
// The Delta Keyer's steps: the screen records, the matte of one pixel, and
// each pass of the keyer's chain as one named step over whole images.
//
// Every step reads its images in float (whatever their depth; a mask reads
// its one channel into all four) and writes the destination's data window;
// an input pixel outside an input's data window reads that input's canvas
// colour, and the destination's canvas colour is the step's formula applied
// once to the inputs' canvases. Spans of a row that no input reaches are
// filled with that canvas result instead of being computed per pixel. A
// destination may be one of the inputs (the step works in place).
//
// With `device` set, a step first runs its kernel of the common library
// ("DeltaKeyer" + the step's name, on the request's render task); when that
// fails it brings its images to main memory and runs its rows on the worker
// pool. A step returns false when abandoned or
// refused memory.
//
// Thread safety: the records are read-only while a step runs; steps may run
// from any thread on images no other thread writes at the same time.
#include "host/krom/kernels/DeltaKeyerKernelParams.h"

namespace Orvane {

class ColorCurvesTable;
class Image;
class Request;

/// One screen record (the block's fields) and the curve table its tuning reads.
struct DeltaKeyerScreenInfo {
    DeltaKeyerScreenInfoParams p{};
    const ColorCurvesTable *table = nullptr;
};

/// What a record is built from.
struct DeltaKeyerScreenInputs {
    float background[3] = {0.5f, 0.5f, 0.5f};
    /// The colour balance reference; components are taken as at least 1e-6.
    float reference[3] = {0.5f, 0.5f, 0.5f};
    double gain = 1.0, balance = 0.5;
    /// Shadows, midtones, highlights gains of the tuning.
    double rangeGains[3] = {1.0, 1.0, 1.0};
    const ColorCurvesTable *table = nullptr;
};

/// Builds a record. The key channel is the one whose balanced background
/// value is largest (ties go to green, then blue, then red); of the other two
/// the smaller is "low" and the larger "mid" (ties: the one later in that
/// order is "mid"). Returns whether the key is distinct, that is whether the
/// largest balanced value exceeds the smallest (false for a grey background).
bool BuildDeltaKeyerScreenInfo(const DeltaKeyerScreenInputs &in, DeltaKeyerScreenInfo &info);

/// The record's denominator d = offset x (1 - (k1 + k2)) + c0; a record whose
/// d is 0 cannot key.
float DeltaKeyerDenominator(const DeltaKeyerScreenInfoParams &p);

/// The record adjusted for a clean-plate pixel c: the background becomes c,
/// c0 := |c(key) - (k1 c(mid) + k2 c(low))| and the offset
/// (c(mid) + c(key) + c(low)) x (gain - 1) / 3.
void DeltaKeyerAdjustForClean(DeltaKeyerScreenInfoParams &p, const float clean[3]);

/// The matte value m of colour p (red, green, blue) under a record.
float DeltaKeyerMatteValue(const DeltaKeyerScreenInfo &info, const float p[3]);

/// Where the steps run.
struct DeltaKeyerRun {
    Request *req = nullptr; ///< abort flag and render task; may be null
    bool device = false;    ///< try the kernel first
};

enum DeltaKeyerReplaceModes : int {
    DeltaKeyerReplaceNone = 0,
    DeltaKeyerReplaceSource = 1,
    DeltaKeyerReplaceHardColor = 2,
    DeltaKeyerReplaceSoftColor = 3,
};

/// The screen pass. Per pixel p (clean-adjusted records when `clean` is
/// given): m = matte of p with the colour record; each colour channel loses
/// min(max((background + offset) x m, 0), p); a = m x gain when `same`, else
/// the alpha record's matte of the original p times gain; alpha =
/// clamp(max(1 - a, max(R, G, B)), 0, 1).
bool ProcessScreen(const DeltaKeyerRun &run, const Image *src, Image *dst, const Image *clean,
                   const DeltaKeyerScreenInfo &color, const DeltaKeyerScreenInfo &alpha, bool same);

/// The pre-matte's ranges over R, G, B and luminance (0.299, 0.587, 0.114).
struct DeltaKeyerPreMatteRanges {
    float low[4] = {0.f, 0.f, 0.f, 0.f};
    float high[4] = {1.f, 1.f, 1.f, 1.f};
    float soft = 0.f; ///< PreMatteSoftRange
};

/// The pre-matte, as grey in all four channels: 0 where R, G, B and
/// luminance all lie in their ranges (inclusive), 1 outside them, or with a
/// positive soft range the largest of min(distance outside, soft) / soft.
bool ProcessPreMatte(const DeltaKeyerRun &run, const Image *src, Image *dst, const DeltaKeyerPreMatteRanges &r);

/// The image the screen pass sees: colour := colour x a + other x (1 - a),
/// a the pre-matte's alpha, other the clean plate's colour or, without one,
/// `other`; alpha is the source's.
bool ProcessPreMatteCombine(const DeltaKeyerRun &run, const Image *src, Image *dst, const Image *preMatte,
                            const Image *clean, const float other[4]);

/// alpha := min(max(a - low, 0) / (high - low), 1); with high <= low a step:
/// 1 above low, 0 at or below it.
bool ProcessThreshold(const DeltaKeyerRun &run, Image *img, float low, float high);

/// alpha := max(ae, min(a, ad)): a the alpha of `soft` (the matte before the
/// threshold), ae and ad the alphas of `eroded` and `dilated` (the threshold
/// matte shrunk and grown); an absent one stands as its default. The colour
/// of `img` is kept.
bool ProcessRestoreFringe(const DeltaKeyerRun &run, const Image *soft, Image *img, const Image *eroded,
                          const Image *dilated, float defaultErode = 0.f, float defaultDilate = 1.f);

/// Rebuilds the colour F of `img` (its alpha is kept) after the matte stage
/// moved alpha from a0 (`before`'s alpha) to a1 (`after`'s alpha), from the
/// source S. Mode None: nothing. Otherwise, if a1 - a0 <= 0: F := F x a1 / a0
/// (0 when a0 is 0); if it rose: Source F + (S - F)(a1 - a0)/(1 - a0) (factor 0
/// when a0 >= 0.9999999), Hard Color F + (a1 - a0) C, Soft Color F + d C with
/// d = sum over R, G, B of (S - F) x (a1 - a0) / 3.
bool ProcessReplace(const DeltaKeyerRun &run, int mode, const Image *src, const Image *before, const Image *after,
                    Image *img, const float replace[3]);

/// The same for the solid matte: a0 from `before`, a1 the alpha of `img`
/// (after the merge), and only where the mask (1 - mask with `invertMask`)
/// is above 0; elsewhere the pixel is unchanged.
bool ProcessReplaceMask(const DeltaKeyerRun &run, int mode, const Image *src, const Image *before, const Image *mask,
                        bool invertMask, Image *img, const float replace[3]);

/// Merges mask s (1 - s with `invertMask`) into the alpha d of `img`:
/// d := (1 - s) d + s, or with `invert` (the destination taken inverted)
/// d := (1 - d)(1 - s) + s.
bool ProcessMaskMerge(const DeltaKeyerRun &run, const Image *mask, Image *img, bool invert, bool invertMask = false);

/// alpha := clamp(max(a, k, R, G, B), 0, 1), k the alpha of `key` (0 when
/// there is none).
bool ProcessColorMax(const DeltaKeyerRun &run, const Image *key, Image *img);

/// The tuning view: red, green, blue := the shadows, midtones, highlights
/// weights of the table at max(R, G, B) of `src`; alpha 1.
bool ProcessRangesToColor(const DeltaKeyerRun &run, const Image *src, Image *dst, const ColorCurvesTable &table);

/// Red, green, blue := the alpha of `src` (1 - alpha with `invert`); alpha
/// is kept.
bool ProcessAlphaToColor(const DeltaKeyerRun &run, const Image *src, Image *dst, bool invert);

/// Red, green, blue of `dst` := those of `src`; alpha is kept.
bool ProcessCopyColor(const DeltaKeyerRun &run, const Image *src, Image *dst);

enum DeltaKeyerSourceAlphaModes : int {
    DeltaKeyerSourceAlphaShow = 0,     ///< dst := (a, a, a, 1)
    DeltaKeyerSourceAlphaSubtract = 1, ///< dst colour and alpha x (1 - a)
};

/// The alpha a of `src` shown as grey, or taken off `dst`.
bool ProcessSourceAlpha(const DeltaKeyerRun &run, const Image *src, Image *dst, int mode);

// ---- The Status view. Its colours, by the alpha a of the matte:
//   black  clear        a < 0.001
//   white  solid        a > 0.9999
//   grey   (0.5)        partly transparent, between
// then tinted half-way toward a colour where a stage changed the alpha by at
// least 0.001: yellow where the matte stage raised it, blue where it lowered
// it, green where the solid matte added to it, red where the garbage matte
// took from it.

/// The change of the matte stage: all four channels of `diff` := a1 - a0, the
/// alphas of `after` and `before`.
bool ProcessStatusDiff(const DeltaKeyerRun &run, const Image *before, const Image *after, Image *diff);
/// Paints the state of `img`'s alpha (1 - alpha with `invert`) into its
/// colour, tinted by `diff`'s alpha when given; alpha is kept.
bool ProcessStatus(const DeltaKeyerRun &run, Image *img, const Image *diff, bool invert);
/// Tints green where merging `mask` (inverted with `invert`) as the solid
/// matte adds m (1 - a) >= 0.001 to `img`'s alpha; run before the merge.
bool ProcessStatusSolid(const DeltaKeyerRun &run, Image *img, const Image *mask, bool invert);
/// Tints red where the garbage `mask` (inverted with `invert`) takes m a >=
/// 0.001 from `img`'s alpha; run before the garbage matte.
bool ProcessStatusGarbage(const DeltaKeyerRun &run, Image *img, const Image *mask, bool invert);

} // namespace Orvane
