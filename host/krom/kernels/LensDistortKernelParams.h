#pragma once
// The parameter block of the "LensDistort" kernel of the common library: the
// Distort mode of the Lens Distort tool, where every output sample reads the
// source at the lens model's direct function. Windows are x0, x1, y0, y1.
#include <cstddef>

#include "host/krom/KROMParams.h"

namespace Orvane {

// canvas: the source's canvas colour. srcWindow: the source's data window
// (empty when it has no pixels); readWindow: the window the reads see as the
// source (its data window, or the frame when the tool clips to it), canvas
// beyond it or, with duplicate set, its border pixels. outDataWindow,
// workSize: the output's. samples: per axis (1, 2, 4, 8); bilinear: else
// nearest; distortionMap: write the mean offset instead of colour.
// The map of a sample p, per axis: u = (p - centre) scale + shift in the
// model's unit coordinates; the source position is p + (U - u) invScale with
// U = outer poly(inner u), the difference taken as outer (poly(v) - v) +
// mix u, v = inner u and mix = outer inner - 1, so that no large terms cancel.
// polynomial: 0 radial decentered (coeffX: c2, u1, v1, c4, u3, v3), 1
// anamorphic (coeffX, coeffY: `terms` coefficients per axis of x^2, y^2, x^4,
// x^2 y^2, y^4, x^6, x^4 y^2, x^2 y^4, y^6). inner, outer, mix: 2 x 2
// matrices, row major.
KROM_PARAM_STRUCT(LensDistortParams, {
    float canvas[4];
    int srcWindow[4];
    int readWindow[4];
    int outDataWindow[4];
    int workSize[2];
    int samples;
    int bilinear;
    int duplicate;
    int distortionMap;
    int polynomial;
    int terms;
    float centre[2];
    float scale[2];
    float shift[2];
    float invScale[2];
    float inner[4];
    float outer[4];
    float mix[4];
    float coeffX[9];
    float coeffY[9];
    int srcCompOrder, dstCompOrder;
})
static_assert(sizeof(LensDistortParams) == 256);
static_assert(offsetof(LensDistortParams, workSize) == 64);
static_assert(offsetof(LensDistortParams, centre) == 96);
static_assert(offsetof(LensDistortParams, mix) == 160);
static_assert(offsetof(LensDistortParams, coeffX) == 176);
static_assert(offsetof(LensDistortParams, srcCompOrder) == 248);
static_assert(offsetof(LensDistortParams, dstCompOrder) == 252);

} // namespace Orvane
