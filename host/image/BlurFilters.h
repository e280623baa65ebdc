#pragma once
// The blur kernels of Image::BlurTagList, one axis at a time (docs/BLUR.md).
//
// Sizes. A blur request carries sizes normalised to the frame: the control
// value / 720. Along X a size s covers s x (frame width) pixels; along Y
// s x (frame width) x XScale / YScale pixels, so that a round blur stays
// round on non-square pixels. Call that length p (pixels, per axis). The
// Gaussian kinds use sigma = p / 2.
//
// Kinds (BlurTypes), with p the length on the axis:
//   BlurBox           one box of width 2p + 1 centred on the pixel; a
//                     fractional width weighs the two end pixels by the part
//                     of them it covers (an area average)
//   BlurSoften        a raised cosine 0.5 (1 + cos(pi k / (p + 1))), |k| < p + 1:
//                     the fallback for unknown kinds, gentle and free of ringing
//   BlurBartlett      the tent 1 - |k| / (p + 1), |k| < p + 1
//   BlurSharpen       `passes` tents (default 4) whose variances add up to the
//                     Gaussian's sigma^2: as wide as the Gaussian of the same
//                     size and close to it in shape (what sharpening subtracts)
//   BlurGaussian      exp(-k^2 / (2 sigma^2)), |k| <= ceil(4 sigma), by direct
//                     convolution
//   BlurFastGaussian  the same Gaussian, for sigma > 3 as five passes of
//                     extended boxes (a box with fractional end weights) whose
//                     variances add up to sigma^2 exactly: cost independent of
//                     the size; below, the sampled Gaussian itself
//   BlurMultiBox      `passes` extended boxes (default 4) whose variances add
//                     up to sigma^2: one pass is a box, many approach the
//                     Gaussian
//   BlurYvVGaussian   the recursive Gaussian of Young and van Vliet (three
//                     poles, their published fit of q to sigma)
//   BlurVYV3/5/6      the recursive Gaussians of van Vliet, Young and Verbeek
//                     with 3, 5 and 6 poles: poles designed at sigma 2, moved
//                     to d^(1/q) with q solved so that the filter's variance is
//                     sigma^2 exactly
// Every kernel is normalised to a sum of 1. Passes apply to BlurSharpen and
// BlurMultiBox only. The recursive kinds reach the whole line; their edges
// continue the line's end values (the canvas colour beyond the source)
// forever, solved exactly (Triggs and Sdika), so a constant stays constant.
// Below sigma 1 they use the sampled Gaussian.
//
// Thread safety: pure functions and values.
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

/// Blur kernels, as BlurFilterType takes them. Values outside the list are
/// read as BlurSoften.
enum BlurTypes : int {
    BlurBox = 0,
    BlurSoften = 1,
    BlurBartlett = 2,
    BlurSharpen = 3,
    BlurGaussian = 4,
    BlurFastGaussian = 5,
    BlurMultiBox = 9,
    BlurYvVGaussian = 10,
    BlurVYV3Gaussian = 11,
    BlurVYV5Gaussian = 12,
    BlurVYV6Gaussian = 13,
};

/// A known kind, else BlurSoften.
ORVANE_API int ValidBlurType(int type);
/// True for the recursive kinds, whose reach is the whole line.
ORVANE_API bool IsRecursiveBlur(int type);
/// The passes a kind runs: for BlurSharpen and BlurMultiBox `passes` within
/// 1..64 (below 1: the default, 4); 1 for the others.
ORVANE_API int BlurPassCount(int type, int passes);
/// Lengths in pixels (p above) of normalised sizes x, y for a frame
/// `frameWidth` wide with pixel aspect xScale:yScale. Negative or undefined
/// sizes give 0. A frame width below 1 counts as 720 (sizes in pixels).
ORVANE_API void BlurPixels(double x, double y, int frameWidth, double xScale, double yScale, double &px, double &py);
/// The sigma of the Gaussian kinds for a length of p pixels.
inline double BlurSigma(double pixels) { return 0.5 * pixels; }

/// One axis of a blur: what runs along each row (or column).
struct ORVANE_API BlurAxis {
    enum class Kind { Identity, Taps, Boxes, Recursive };
    Kind kind = Kind::Identity;

    /// Taps: weights[0 .. 2 radius], weights[radius] at the pixel itself.
    std::vector<float> weights;
    int radius = 0;

    /// Boxes, run one after another: each averages the 2r + 1 samples around
    /// a pixel and the next one out on each side weighted `alpha` (0..1).
    struct Box {
        int r = 0;
        double alpha = 0.0;
        int Reach() const { return alpha > 0.0 ? r + 1 : r; }
    };
    std::vector<Box> boxes;

    /// Recursive: w[n] = gain x[n] - sum a[j] w[n - 1 - j] forward, then the
    /// same backward; gain = 1 + sum a. `boundary` (order x order, row major)
    /// maps the forward pass's last outputs less the end value u to the
    /// backward pass's first outputs less u:
    ///   y[N + m] - u = sum_i boundary[m][i] (w[N - 1 - i] - u).
    int order = 0;
    double gain = 1.0;
    double a[6] = {};
    std::vector<double> boundary;

    /// Samples a pixel reads on each side; -1 for the whole line.
    int Reach() const;
    /// The response as one set of taps (2 Reach() + 1 of them); empty for a
    /// recursive axis.
    std::vector<float> AsTaps() const;
};

/// The axis of kind `type` (any number; unknown ones as BlurSoften) for a
/// length of `pixels`, with `passes` as BlurPassCount reads it.
ORVANE_API BlurAxis MakeBlurAxis(int type, double pixels, int passes);

} // namespace Orvane
