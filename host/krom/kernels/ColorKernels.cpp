// Colour kernels of the common library. Each does what the tool's rows do,
// step for step and in the same float order, so results agree bit for bit
// where the arithmetic is the same (everything but the gamma power, which is
// the device's powf).
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kBrightnessContrastKernels[] = R"KROM(
KROM_FN float bc_power(float x, float e) { return _copysignf(_powf(_fabs(x), e), x); }

/// Integer images (8 and 16 bits) keep every step within 0..1, as their rows
/// do in 16-bit arithmetic; float images let values leave it.
KROM_FN int bc_integer(__CONSTANTREF__ BrightnessContrastParams *q) { return ((q->srcCompOrder >> 4) & 3) < 2; }
KROM_FN float bc_bound(int integer, float v) { return integer ? _fminf(_fmaxf(v, 0.f), 1.f) : v; }

/// The pre-divide; false when an integer pixel with zero alpha is done.
KROM_FN int bc_pre_divide(__CONSTANTREF__ BrightnessContrastParams *q, float *p) {
    if (!q->prePost) return 1;
    if (bc_integer(q)) {
        for (int c = 0; c < 3; ++c)
            if (q->chans[c]) p[c] = p[3] <= 0.f ? 0.f : _fminf(p[c] / p[3], 1.f);
        return p[3] > 0.f || q->chans[3];
    }
    const float a = _fabs(p[3]) < 1.1920929e-07f ? 0.f : 1.f / p[3];
    for (int c = 0; c < 3; ++c)
        if (q->chans[c]) p[c] = p[c] * a;
    return 1;
}

KROM_FN void bc_finish(__CONSTANTREF__ BrightnessContrastParams *q, float *p) {
    if (q->prePost)
        for (int c = 0; c < 3; ++c)
            if (q->chans[c]) p[c] = p[c] * p[3];
    for (int c = 0; c < 4; ++c) {
        if (!q->chans[c]) continue;
        if (q->clipBlack && p[c] < 0.f) p[c] = 0.f;
        if (q->clipWhite && p[c] > 1.f) p[c] = 1.f;
    }
}

KROM_FN float4 bc_forward(__CONSTANTREF__ BrightnessContrastParams *q, float4 in) {
    float p[4] = {in.x, in.y, in.z, in.w};
    const int integer = bc_integer(q);
    if (!bc_pre_divide(q, p)) return make_float4(p[0], p[1], p[2], p[3]);
    for (int c = 0; c < 4; ++c) {
        if (!q->chans[c]) continue;
        float x = bc_bound(integer, q->gain * p[c] + q->lift);
        if (q->doGamma) x = bc_power(x, q->gamma);
        p[c] = bc_bound(integer, (x - 0.5f) * q->finalContrast + 0.5f + q->bright);
    }
    if (q->doSat) {
        const float y = 0.299f * p[0] + 0.587f * p[1] + 0.114f * p[2];
        for (int c = 0; c < 3; ++c)
            if (q->chans[c]) p[c] = bc_bound(integer, p[c] * q->sat + y * q->_sat);
    }
    if (q->useLowHigh)
        for (int c = 0; c < 4; ++c)
            if (q->chans[c]) p[c] = bc_bound(integer, (p[c] - q->low) * q->finalScale);
    bc_finish(q, p);
    return make_float4(p[0], p[1], p[2], p[3]);
}

KROM_FN float4 bc_reverse(__CONSTANTREF__ BrightnessContrastParams *q, float4 in) {
    float p[4] = {in.x, in.y, in.z, in.w};
    const int integer = bc_integer(q);
    if (!bc_pre_divide(q, p)) return make_float4(p[0], p[1], p[2], p[3]);
    if (q->useLowHigh)
        for (int c = 0; c < 4; ++c)
            if (q->chans[c]) p[c] = bc_bound(integer, q->finalScale * p[c] + q->low);
    if (q->doSat) {
        const float r = p[0], g = p[1], b = p[2];
        if (q->chans[0]) p[0] = bc_bound(integer, q->satMat_v1[0] * r + q->satMat_v1[1] * g + q->satMat_v1[2] * b);
        if (q->chans[1]) p[1] = bc_bound(integer, q->satMat_v2[0] * r + q->satMat_v2[1] * g + q->satMat_v2[2] * b);
        if (q->chans[2]) p[2] = bc_bound(integer, q->satMat_v3[0] * r + q->satMat_v3[1] * g + q->satMat_v3[2] * b);
    }
    for (int c = 0; c < 4; ++c) {
        if (!q->chans[c]) continue;
        float x = bc_bound(integer, (p[c] - q->bright - 0.5f) * q->finalContrast + 0.5f);
        if (q->doGamma) x = bc_power(x, q->gamma);
        p[c] = bc_bound(integer, (x - q->lift) * q->gain);
    }
    bc_finish(q, p);
    return make_float4(p[0], p[1], p[2], p[3]);
}

/// One pixel of either kernel: the chain inside the input's window, the
/// processed canvas colour beyond it.
KROM_FN void bc_pixel(__CONSTANTREF__ BrightnessContrastParams *q, __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output,
                      int x, int y, int reverse) {
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->outDataWindow[0], y + q->outDataWindow[2]);
    float4 c = to_float4_v(q->dp);
    if (IsInsideROI(pos, q->inDataWindow)) {
        c = _tex2DVecN(input, pos.x - q->inDataWindow[0], pos.y - q->inDataWindow[2], q->srcCompOrder);
        c = reverse ? bc_reverse(q, c) : bc_forward(q, c);
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, q->dstCompOrder));
}

__KERNEL__ void BrightnessContrast(__CONSTANTREF__ BrightnessContrastParams *p_pParams, __TEXTURE2D__ input,
                                   __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    bc_pixel(p_pParams, input, output, x, y, 0);
}

__KERNEL__ void BrightnessContrastReverse(__CONSTANTREF__ BrightnessContrastParams *p_pParams, __TEXTURE2D__ input,
                                          __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    bc_pixel(p_pParams, input, output, x, y, 1);
}
)KROM";

const char kColorMatrixKernel[] = R"KROM(
__KERNEL__ void ColorMatrix(__CONSTANTREF__ ColorMatrixParams *p_pParams, __TEXTURE2D__ input,
                            __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int2 pos = make_int2(x + p_pParams->outDataWindow[0], y + p_pParams->outDataWindow[2]);
    float4 c = to_float4_v(p_pParams->dp);
    if (IsInsideROI(pos, p_pParams->inDataWindow)) {
        const float4 s = _tex2DVecN(input, pos.x - p_pParams->inDataWindow[0], pos.y - p_pParams->inDataWindow[2],
                                    p_pParams->srcCompOrder);
        __CONSTANTREF__ float *k = p_pParams->m;
        c = make_float4(k[0] * s.x + k[1] * s.y + k[2] * s.z + k[3] * s.w + k[4],
                        k[5] * s.x + k[6] * s.y + k[7] * s.z + k[8] * s.w + k[9],
                        k[10] * s.x + k[11] * s.y + k[12] * s.z + k[13] * s.w + k[14],
                        k[15] * s.x + k[16] * s.y + k[17] * s.z + k[18] * s.w + k[19]);
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, p_pParams->dstCompOrder));
}
)KROM";

} // namespace Orvane
