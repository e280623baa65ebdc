#pragma once
// The reconstruction filters every resampler of the host shares: the
// separable resizers (ResizeTagList), the general transform sampler
// (TransformMatrix) and the point samplers (SamplePixel*). A filter is a
// function of the distance x from a sample, in source pixels at scale 1,
// with a finite radius (its support); when shrinking, resamplers stretch it
// by 1 / scale so that every covered source pixel takes part.
//
//   RszNearest     the pixel under the position
//   RszBox         1 inside |x| <= 1/2 (area average when shrinking)
//   RszLinear      the tent 1 - |x|, radius 1
//   RszQuadratic   the quadratic B-spline, radius 3/2 (smooth, slightly soft)
//   RszCubic       the cubic B-spline (B = 1, C = 0), radius 2 (soft)
//   RszCatmullRom  the interpolating cubic (B = 0, C = 1/2), radius 2
//   RszGaussian    exp(-2 x^2) (sigma 1/2), radius 3/2
//   RszMitchell    the cubic with B = C = 1/3, radius 2
//   RszLanczos     sinc(x) sinc(x / 3), radius 3
//   RszSinc        sinc(x) times the chosen window, radius 4
//   RszBessel      jinc(x) = 2 J1(pi x) / (pi x) times the chosen window, radius 4
// Windows (for sinc and Bessel only), with t = x / radius:
//   Hanning 0.5 + 0.5 cos(pi t); Hamming 0.54 + 0.46 cos(pi t);
//   Blackman 0.42 + 0.5 cos(pi t) + 0.08 cos(2 pi t);
//   Kaiser I0(beta sqrt(1 - t^2)) / I0(beta), beta = 6.5.
// Values are not normalised: resamplers divide each tap run by its sum.
//
// Thread safety: pure functions.
#include "host/core/Export.h"

namespace Orvane {

/// Resize filters, as ResizeFilter and XfFilter take them.
enum RszTypes : int {
    RszNearest = 1,
    RszBox = 2,
    RszLinear = 3,
    RszQuadratic = 4,
    RszCubic = 5,
    RszCatmullRom = 6,
    RszGaussian = 7,
    RszMitchell = 8,
    RszLanczos = 9,
    RszSinc = 10,
    RszBessel = 11,
};
constexpr int RszFirst = RszNearest, RszLast = RszBessel;

/// Windows of the sinc and Bessel filters, as ResizeWindow and XfWindow take them.
enum ResizeWindowType : int {
    RszWindowHanning = 100,
    RszWindowHamming = 101,
    RszWindowBlackman = 102,
    RszWindowKaiser = 103,
};

/// What lies beyond an image's border for a resampler.
enum EdgeMode : int {
    EdgeCanvas = 0,    ///< the canvas colour
    EdgeWrap = 1,      ///< the image repeats
    EdgeDuplicate = 2, ///< the border pixel repeats
    EdgeMirror = 3,    ///< the image repeats mirrored about its border
};

/// A known filter number, else RszLinear.
ORVANE_API int ValidResizeFilter(int type);
/// A known window number, else RszWindowHanning.
ORVANE_API int ValidResizeWindow(int window);
/// The filter's radius in source pixels at scale 1.
ORVANE_API double ResizeFilterSupport(int type);
/// The filter's value at distance x (source pixels at scale 1); `window`
/// counts for RszSinc and RszBessel only. Zero at and beyond the support.
ORVANE_API double ResizeFilterValue(int type, int window, double x);

/// Maps a sample index i outside [lo, hi) back inside by the edge policy:
/// Wrap repeats the range, Duplicate clamps to the border pixel, Mirror
/// reflects about the border edge (lo - 1 reads lo, lo - 2 reads lo + 1).
/// Canvas gives lo - 1 for any index outside (the caller reads the canvas
/// colour there), as does an empty range. Inside indices return unchanged.
ORVANE_API int MapEdge(int i, int lo, int hi, int edges);

} // namespace Orvane
