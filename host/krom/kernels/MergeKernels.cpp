// The merge kernel of the common library: the rows of MergeImagesTagList
// (host/image/MergeModes.cpp) for the modes without divisions (Normal with
// every operator, Screen, Multiply, Darken, Lighten, Difference, Exclusion,
// Add, Subtract; and Replace, which mixes a merged stack back over its
// background), term for term and in the same float order, so float
// results are the rows' bits. Mode and operator numbers are those of
// MergeApplyMode and MergeOperatorType.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kMergeKernel[] = R"KROM(
KROM_FN void mg_merge(__CONSTANTREF__ MergeParams *q, const float *f, const float *b, float *o) {
    const float as = f[3], ab = b[3];
    const float yc = 1.f - q->hc * as, ya = 1.f - q->kk * as;
    if (q->mode == 0) {
        if (q->op == 1) {
            for (int c = 0; c < 3; ++c) o[c] = ab * f[c];
            o[3] = q->fa * ab * as;
        } else if (q->op == 2) {
            const float x = 1.f - ab;
            for (int c = 0; c < 3; ++c) o[c] = x * f[c];
            o[3] = q->fa * x * as;
        } else if (q->op == 5) {
            for (int c = 0; c < 3; ++c) o[c] = f[c];
            o[3] = q->fa * as;
        } else if (q->op == 3) {
            for (int c = 0; c < 3; ++c) o[c] = ab * f[c] + yc * b[c];
            o[3] = q->fa * ab * as + ya * ab;
        } else if (q->op == 4) {
            const float x = 1.f - ab;
            for (int c = 0; c < 3; ++c) o[c] = x * f[c] + yc * b[c];
            o[3] = q->fa * x * as + ya * ab;
        } else {
            for (int c = 0; c < 3; ++c) o[c] = f[c] + yc * b[c];
            o[3] = q->fa * as + ya * ab;
        }
        return;
    }
    const float xs = 1.f - ab;
    for (int c = 0; c < 3; ++c) {
        float t;
        if (q->mode == 1)
            t = as * b[c] + ab * f[c] - f[c] * b[c];
        else if (q->mode == 3)
            t = f[c] * b[c];
        else if (q->mode == 9)
            t = _fminf(as * b[c], ab * f[c]);
        else if (q->mode == 10)
            t = _fmaxf(as * b[c], ab * f[c]);
        else if (q->mode == 11)
            t = _fabs(as * b[c] - ab * f[c]);
        else if (q->mode == 12)
            t = as * b[c] + ab * f[c] - 2.f * f[c] * b[c];
        else if (q->mode == 17)
            t = as * b[c] + ab * f[c];
        else
            t = as * b[c] - ab * f[c];
        o[c] = f[c] * xs + b[c] * yc + t;
    }
    o[3] = q->fa * as + ya * ab;
}

__KERNEL__ void Merge(__CONSTANTREF__ MergeParams *p_pParams, __TEXTURE2D__ fg, __TEXTURE2D__ bg,
                      __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ MergeParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->outWindow[0], y + q->outWindow[2]);
    const int2 fpos = make_int2(pos.x - q->fgOffset[0], pos.y - q->fgOffset[1]);
    float4 fc = to_float4_v(q->fgCanvas), bc = to_float4_v(q->bgCanvas);
    if (IsInsideROI(fpos, q->fgWindow)) fc = _tex2DVecN(fg, fpos.x - q->fgWindow[0], fpos.y - q->fgWindow[2], 0);
    if (IsInsideROI(pos, q->bgWindow)) bc = _tex2DVecN(bg, pos.x - q->bgWindow[0], pos.y - q->bgWindow[2], 0);
    const float f[4] = {fc.x, fc.y, fc.z, fc.w}, b[4] = {bc.x, bc.y, bc.z, bc.w};
    float o[4];
    mg_merge(q, f, b, o);
    if (q->doBlend)
        for (int c = 0; c < 4; ++c) o[c] = b[c] + q->blend * (o[c] - b[c]);
    for (int c = 0; c < 4; ++c) o[c] = q->chans[c] ? o[c] : b[c];
    _tex2DVec4Write(output, x, y, make_intensity(make_float4(o[0], o[1], o[2], o[3]), q->dstCompOrder));
}
)KROM";

} // namespace Orvane
