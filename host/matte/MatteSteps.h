#pragma once
// The matte steps every keyer shares: blurring one channel, copying a
// channel, spill suppression, fringe colour, levels on a channel, invert,
// post-multiply, in-fill and the garbage and solid mattes. docs/MATTE.md
// gives every formula.
//
// Conventions for all steps:
// - `channel` is 0 red, 1 green, 2 blue, 3 alpha (MatteChannel). A
//   single-channel (mask) image has only alpha: its one channel.
// - Float images (float16, float32) are worked in float; integer images
//   (int8, int16) in 16-bit steps: int8 values are widened to 16 bits and
//   rounded back once. Each step works in place over the image's data window,
//   and computes the canvas colour's result once, by the same formula.
// - Rows run on the worker pool; `req` (may be null) gives the abort flag,
//   polled per row (as is the image's own): a step that is abandoned or
//   refused memory returns false and leaves rows it did not reach, and the
//   canvas, as they were.
// - A null image, or a channel outside 0..3, gives false. The colour steps
//   (spill, fringe, post-multiply) leave a single-channel image as it is.
// - An image whose pixels are on the device is downloaded first
//   (Image::DownloadGPUMem); a step that fails to do so returns false.
//
// Thread safety: every step may be called from any thread on images no other
// thread writes at the same time.
#include "host/core/Export.h"
#include "host/core/Object.h"
#include "host/core/TagList.h"

namespace Orvane {

class Image;
class Request;

enum MatteChannel : int { MatteRed = 0, MatteGreen = 1, MatteBlue = 2, MatteAlpha = 3 };

/// Blurs one channel of `img` in place with a Gaussian-like blur: `kind` a
/// BlurTypes value (BlurGaussian, BlurFastGaussian, ...), `size` in the
/// units of the Blur tool's size (pixels at a frame 720 wide, scaled with the
/// frame), `passes` for the kinds that take them. Size 0 changes nothing.
ORVANE_API bool MatteCore_DoSoftenChannel(Request *req, Image *img, int channel, double size, int passes, int kind);

/// Blurs one channel of `img` in place with `passes` boxes (BlurMultiBox; one
/// pass is a box, two a tent), `size` as above.
ORVANE_API bool MatteCore_DoMultiBox(Request *req, Image *img, int channel, double size, int passes);

/// dst[to] := src[from] over dst's data window; src's canvas colour where
/// dst's window reaches beyond src's. dst's canvas channel takes src's.
ORVANE_API bool MatteCore_DoCopyChannel(Request *req, const Image *src, Image *dst, int from, int to);

/// Spill suppression methods, from gentlest to strongest: the key channel is
/// held to a limit made of the two other channels a and b.
enum SpillMethods : int {
    SpillRare = 0,     ///< limit max(a, b)
    SpillMedium = 1,   ///< limit (a + b) / 2
    SpillWellDone = 2, ///< limit min(a, b)
    SpillBurnt = 3,    ///< limit max(0, (3 min(a, b) - max(a, b)) / 2)
};

/// What MatteCore_DoSpill takes.
struct ChromaValues {
    int keyChannel = 1;     ///< the screen's channel: 0 blue, 1 green, 2 red
    double amount = 1.0;    ///< 0 none, 1 the whole spill; more takes more, never below 0
    int method = SpillRare; ///< SpillMethods
};

/// Takes the spill off the key channel: k := max(0, k - amount x max(0, k - limit)).
/// The other channels and alpha stay as they are. The key channel and the
/// method are held to their ranges. For colours whose other two channels are
/// not negative, each method takes at least as much as the one before it.
/// The result is never below 0 (a negative key value becomes 0).
ORVANE_API bool MatteCore_DoSpill(Request *req, Image *img, const ChromaValues &chroma);

/// Colours the fringe of a matte. `edge` holds in its alpha the (blurred)
/// matte that says where the fringe is, e; its weight is w = 4 e (1 - e), 1
/// at the half-transparent edge and 0 where the matte is solid or clear.
/// Each colour channel C of `img` becomes C x (1 + w (shape - 1)) + w x shift,
/// with the shifts red/cyan, green/magenta and blue/yellow added to red,
/// green and blue. e is held to 0..1; a null `edge` gives false. DoFringe
/// is the 16-bit form, DoFringeFlt the float one; each refuses the other kind
/// of image.
ORVANE_API bool MatteCore_DoFringe(Request *req, Image *img, const Image *edge, double shape, double redCyan,
                                   double greenMagenta, double blueYellow);
ORVANE_API bool MatteCore_DoFringeFlt(Request *req, Image *img, const Image *edge, double shape, double redCyan,
                                      double greenMagenta, double blueYellow);

/// a := 1 - a on `channel` (default alpha).
ORVANE_API bool MatteCore_DoInvert(Request *req, Image *img, int channel = MatteAlpha);

/// Red, green and blue := times alpha.
ORVANE_API bool MatteCore_DoPostMultiply(Request *req, Image *img);

/// Cleans a matte toward solid (amount > 0: a := min(1, a / (1 - amount)),
/// the foreground's holes filled) or toward clear (amount < 0:
/// a := max(0, (a + amount) / (1 + amount)), the background's haze taken
/// off); amount is held to [-1, 1]: at 1 every value above 0 goes to 1, at
/// -1 every value below 1 goes to 0. Amount 0 changes nothing.
ORVANE_API bool MatteCore_DoInFill(Request *req, Image *img, double amount, int channel = MatteAlpha);

/// Levels on one channel, under the tags (Tags.h, "Matte levels"):
///   MatteLevelsChannel  (int, default alpha)
///   MatteLevelsLow, MatteLevelsHigh  thresholds over 0..1 (default 0, 1):
///       a1 = clamp((a - low) / (high - low), 0, 1); with high <= low, a1 is
///       1 from high on and 0 below
///   MatteLevelsContrast  contract/expand c in [-1, 1] (default 0): for
///       c >= 0 a2 = min(1, a1 / (1 - c)), for c < 0 a2 = max(0, (a1 + c) / (1 + c))
///   MatteLevelsGamma  g > 0 (default 1; held to at least 1e-5): a3 = a2^(1 / g)
/// DoLevels is the 16-bit form, DoLevelsFlt the float one; each refuses the
/// other kind of image.
ORVANE_API bool DoLevels(Request *req, Image *img, const TagList &tags);
ORVANE_API bool DoLevelsFlt(Request *req, Image *img, const TagList &tags);

/// DoGarbageMatte's modes.
enum GarbageMatteModes : int {
    GarbageMatteGarbage = 0, ///< alpha := alpha x (1 - m): the mask takes away
    GarbageMatteSolid = 1,   ///< alpha := alpha + m x (1 - alpha): the mask makes solid
};

/// Applies `mask` (its alpha, or its one channel; its canvas beyond its
/// window; held to 0..1; 1 - m when `invert`) to `img`'s alpha by `mode`.
/// With `premultiplied`, a garbage matte scales the colour with the alpha.
/// When the mask's (inverted) canvas is not clear, or the mask changes the
/// result on `img`'s canvas colour, the result's data window is widened to
/// take in the mask's, by a new image, so the mask's region is not cut off.
/// Returns the result (`img` itself, changed in place, or the new image); null
/// when abandoned or out of memory. A null mask returns `img` unchanged.
ORVANE_API Ref<Image> DoGarbageMatte(Request *req, Image *img, const Image *mask, int mode, bool premultiplied,
                                     bool invert);

} // namespace Orvane
