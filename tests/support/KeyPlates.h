#pragma once
// Synthetic keying plates: a foreground of known alpha and known colour shot over an unevenly lit green or blue
// screen, with spill and grain, so that a keyer's matte and its spill suppression can be scored against the truth.
//
// A plate is made from a fixed layout of shapes placed in fractions of the frame (sizes in fractions of the shorter
// side, hair widths in pixels), each belonging to one kind; a plate of one kind holds that kind's shapes alone,
// Everything holds them all (they do not overlap, except the hair over its head). Per pixel the shapes are sampled
// on a 4 x 4 grid and composited front over back at each sample; the true values are the means of the samples, so
// they are exact to that sampling. The screen's light and the spill are evaluated at the pixel's centre.
//
//   screen(x, y)   = screenColour * light(u, v), u, v in 0..1 across the frame,
//                    light = 1 + 0.06 (2u - 1) + 0.03 (2v - 1) + 0.08 (1/3 - r^2), r^2 = ((2u-1)^2 + (2v-1)^2) / 2:
//                    a gradient brighter to the right and top plus a vignette; its mean over the frame is 1 and it
//                    stays within 0.857 .. 1.055 (inside kScreenUnevenness)
//   spilled colour = colour + spill * screen(x, y), spill = kSpillAtEdge * max(0, 1 - depth / reach), where depth is
//                    how far inside its shape's edge a sample lies and reach = 0.03 of the shorter side
//   composite      = spilledForeground + screen * (1 - trueAlpha) + grain, alpha 1; grain is Gaussian, of
//                    `grainSigma` per channel and pixel, seeded, independent of the pixel's neighbours
//
// All images are the frame's size; colour images are RGBA float32 and premultiplied, as every image in Orvane.
//
// Thread safety: the functions share no state and may run on any thread; MakeKeyPlate uses the worker pool.
#include <cstdint>
#include <string>

#include "host/image/Image.h"

namespace Orvane::Test {

/// Which shapes a plate holds.
enum class KeyPlateKind {
    HardEdges,  ///< a red rounded box and a dark disc with sharp (anti-aliased) edges
    SoftEdges,  ///< a grey disc whose edge is blurred by a Gaussian of 0.012 of the shorter side
    Hair,       ///< a skin-coloured disc with 24 thin curved strands (0.4 to 2 pixels wide, 50 to 90% opaque)
    MotionBlur, ///< a bright box smeared along a 20 degree direction over 0.1 of the shorter side
    Veils,      ///< two boxes of constant 40% and 70% alpha
    Everything, ///< all of the above in one frame
};

enum class ScreenColor { Green, Blue };

constexpr int kKeyPlateSamples = 4;         ///< samples per pixel along each axis
constexpr double kKeyPlateGrain = 0.01;     ///< the default grain sigma
constexpr double kScreenUnevenness = 0.15;  ///< the screen's light stays within its mean colour times 1 +- this
constexpr double kSpillAtEdge = 0.35;       ///< screen colour added to the foreground at its edges
constexpr double kEdgeColourMinAlpha = 0.1; ///< EdgeColourDistance's default true-alpha threshold

struct KeyPlate {
    std::string name;             ///< "hair-green"
    Ref<Image> composite;         ///< what the camera sees: foreground over the screen, spill and grain
    Ref<Image> trueAlpha;         ///< the exact matte, a float32 mask image
    Ref<Image> trueForeground;    ///< the foreground without spill, premultiplied by (and alpha) the true alpha
    Ref<Image> spilledForeground; ///< the foreground as the screen lit it (in the composite), premultiplied
    Ref<Image> cleanScreen;       ///< the screen alone, without grain, alpha 1 (a clean plate)
    double screenR = 0, screenG = 0, screenB = 0; ///< the screen's mean colour
    double grainSigma = 0;
};

/// Makes a plate of `width` x `height` (smaller sides are raised to 16). The same arguments give the same bits; the
/// seed picks the hair strands and the grain.
KeyPlate MakeKeyPlate(KeyPlateKind kind, ScreenColor screen, int width, int height, uint64_t seed,
                      double grainSigma = kKeyPlateGrain);

/// The kind's name in plate names and files ("hard", "soft", "hair", "motion", "veils", "everything").
const char *KeyPlateKindName(KeyPlateKind kind);

/// How far a matte's alpha is from the truth: the mean absolute error over all pixels, the worst, and the mean over
/// the edge pixels (where 0 < true alpha < 1).
struct MatteScore {
    double meanError = 0, worstError = 0, edgeMeanError = 0;
};

/// Scores the alpha of `alpha` (a mask or an RGBA image; outside its data window its canvas) against `trueAlpha`
/// over trueAlpha's frame. All NaN when the frames differ in size.
MatteScore ScoreMatte(const Image &alpha, const Image &trueAlpha);

/// How much spill a keyed (premultiplied) result keeps: the mean over the pixels the spill reaches whose true alpha
/// exceeds `minTrueAlpha` of |keyed rgb - keyed alpha * true straight colour|. The foreground's own alpha is used, so
/// a matte error does not count here (ScoreMatte measures it). 0 for the true foreground;
/// NaN when the frames differ or no pixel qualifies.
double EdgeColourDistance(const Image &keyed, const KeyPlate &plate, double minTrueAlpha = kEdgeColourMinAlpha);

} // namespace Orvane::Test
