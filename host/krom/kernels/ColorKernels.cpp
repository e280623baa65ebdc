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

namespace Orvane {

const char kColorCorrectorKernels[] = R"KROM(
/// Applies 3 by 4 matrix m (12 floats) to c.
KROM_FN void cc_apply(__CONSTANTREF__ float *m, const float *c, float *out) {
    for (int i = 0; i < 3; ++i) out[i] = m[4 * i] * c[0] + m[4 * i + 1] * c[1] + m[4 * i + 2] * c[2] + m[4 * i + 3];
}

KROM_FN float cc_hue(const float *c) {
    const float mx = _fmaxf(c[0], _fmaxf(c[1], c[2])), mn = _fminf(c[0], _fminf(c[1], c[2]));
    if (mx == mn) return 0.f;
    const float d = mx - mn;
    float h = mx == c[0] ? (c[1] - c[2]) / d : mx == c[1] ? (c[2] - c[0]) / d + 2.f : (c[0] - c[1]) / d + 4.f;
    h = h / 6.f;
    return h < 0.f ? h + 1.f : h;
}

/// One record's range function on p (RGB) with luminance L; alpha stays.
KROM_FN void cc_range(__CONSTANTREF__ CCProcessPixelParams *q, __TEXTURE2D__ tables, int r, float L, const float *p,
                      float *c, int suppression) {
    const int flags = q->doFlag >> (4 * r);
    const int mode = (q->orderTintChannel >> 1) & 3;
    c[0] = p[0], c[1] = p[1], c[2] = p[2];
    if (flags & 1) {
        __CONSTANTREF__ float *m = q->colorMat + 48 * r;
        if (mode == 0 || (L >= 0.f && L <= 1.f)) {
            cc_apply(L < 0.5f ? m : m + 12, p, c);
        } else {
            float y[3], z[3];
            cc_apply(q->colorMat + 144, p, y);
            const float luma = y[0];
            y[0] = L < 0.f ? _fmaxf(y[0], 0.f) : _fminf(y[0], 1.f);
            cc_apply(L < 0.f ? m + 24 : m + 36, y, z);
            z[0] = luma;
            cc_apply(q->colorMat + 156, z, c);
        }
    }
    __CONSTANTREF__ float *l1 = q->colorMatSimple + 16 * r;
    __CONSTANTREF__ float *l2 = l1 + 8;
    for (int i = 0; i < 3; ++i) {
        float x = c[i];
        const float e = q->gamma[4 * r + i];
        const int gamma = (flags & 2) && e != 1.f;
        if (q->orderTintChannel & 1) {
            if (flags & 4) x = x * l1[i] + l1[4 + i];
            if (gamma) x = _copysignf(_powf(_fabs(x), e), x);
            if (flags & 8) x = x * l2[i] + l2[4 + i];
        } else {
            if (gamma) x = _copysignf(_powf(_fabs(x), e), x);
            if (flags & 4) x = x * l1[i] + l1[4 + i];
        }
        c[i] = x;
    }
    if (suppression && q->hasSuppressionTable[r]) {
        const int n = q->sampleCount[r];
        const int i = (int)_fminf(_fmaxf((float)(int)((float)n * cc_hue(c)), 0.f), (float)(n - 1));
        const float f = _tex2DVecN(tables, i, r, 0).x;
        if (_fabs(f - 1.f) > 1e-6f) {
            const float4 w0 = _tex2DVecN(tables, 0, 3, 0), w1 = _tex2DVecN(tables, 1, 3, 0);
            const float4 w2 = _tex2DVecN(tables, 2, 3, 0), w3 = _tex2DVecN(tables, 3, 3, 0);
            const float d = (w0.w * c[0] + w1.w * c[1] + w2.w * c[2] + w3.w) * (1.f - f);
            for (int k = 0; k < 3; ++k) c[k] = c[k] * f + d;
        }
    }
}

KROM_FN float cc_luma(const float *p) { return 0.299f * p[0] + 0.587f * p[1] + 0.114f * p[2]; }

/// The range weights of luminance L: row 3 of the table image (row 0 of a range picture's table).
KROM_FN float4 cc_weights(__TEXTURE2D__ tables, int row, int n, float L) {
    const float x = L > 0.f ? (L < 1.f ? L : 1.f) : 0.f;
    return _tex2DVecN(tables, (int)(x * (float)(n - 1) + 0.5f), row, 0);
}

KROM_FN void cc_pixel(__CONSTANTREF__ CCProcessPixelParams *q, __TEXTURE2D__ input, __TEXTURE2D__ tables,
                      __TEXTURE2D_WRITE__ output, int x, int y, int suppression) {
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    float4 c = to_float4_v(q->processCanvasColor);
    if (IsInsideROI(pos, q->srcWindow)) {
        const float4 in = _tex2DVecN(input, pos.x - q->srcWindow[0], pos.y - q->srcWindow[2], q->srcCompOrder);
        float p[4] = {in.x, in.y, in.z, in.w}, out[4], part[3];
        if (q->prePost & 1) {
            if (p[3] == 0.f)
                p[0] = p[1] = p[2] = 0.f;
            else
                for (int i = 0; i < 3; ++i) p[i] = p[i] / p[3];
        }
        const int ranges = (q->orderTintChannel >> 3) & 1;
        const float L = ranges || (q->doFlag & 1) ? cc_luma(p) : 0.f;
        if (!ranges) {
            cc_range(q, tables, 0, L, p, out, suppression);
            out[3] = p[3];
        } else {
            const float4 w4 = cc_weights(tables, 3, q->sampleCount[3], L);
            const float w[3] = {w4.x, w4.y, w4.z};
            out[0] = out[1] = out[2] = out[3] = 0.f;
            for (int r = 0; r < 3; ++r) {
                cc_range(q, tables, r, L, p, part, suppression);
                for (int i = 0; i < 3; ++i) out[i] += w[r] * part[i];
                out[3] += w[r] * p[3];
            }
        }
        if (q->prePost & 2) {
            const float a = out[3] > -1e-6f && out[3] < 1e-6f ? 0.f : out[3];
            for (int i = 0; i < 3; ++i) out[i] = out[i] * a;
        }
        c = make_float4(out[0], out[1], out[2], out[3]);
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, q->dstCompOrder));
}

__KERNEL__ void CCProcessPixel(__CONSTANTREF__ CCProcessPixelParams *p_pParams, __TEXTURE2D__ input,
                               __TEXTURE2D__ tables, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    cc_pixel(p_pParams, input, tables, output, x, y, 1);
}

__KERNEL__ void CCProcessPixelSimple(__CONSTANTREF__ CCProcessPixelParams *p_pParams, __TEXTURE2D__ input,
                                     __TEXTURE2D__ tables, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    cc_pixel(p_pParams, input, tables, output, x, y, 0);
}
)KROM";

const char kColorCorrectorRangeKernel[] = R"KROM(
__KERNEL__ void CCProcessRange(__CONSTANTREF__ CCProcessRangeParams *p_pParams, __TEXTURE2D__ input,
                               __TEXTURE2D__ tables, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ CCProcessRangeParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    float4 c = to_float4_v(q->defaultP);
    if (IsInsideROI(pos, q->srcWindow)) {
        const float4 in = _tex2DVecN(input, pos.x - q->srcWindow[0], pos.y - q->srcWindow[2], q->srcCompOrder);
        float p[3] = {in.x, in.y, in.z};
        if (q->preDivide)
            for (int i = 0; i < 3; ++i) p[i] = in.w == 0.f ? 0.f : p[i] / in.w;
        const float L = 0.299f * p[0] + 0.587f * p[1] + 0.114f * p[2];
        const float v = L > 0.f ? (L < 1.f ? L : 1.f) : 0.f;
        const float4 w = _tex2DVecN(tables, (int)(v * (float)(q->sampleCount - 1) + 0.5f), 0, 0);
        c = q->selected == 0 ? make_float4(w.x, w.y, w.z, 1.f)
            : q->selected == 1 ? make_float4(w.x, w.x, w.x, 1.f)
            : q->selected == 2 ? make_float4(w.y, w.y, w.y, 1.f)
                               : make_float4(w.z, w.z, w.z, 1.f);
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, q->dstCompOrder));
}
)KROM";

const char kColorCorrectorEqualizeKernel[] = R"KROM(
/// Applies 3 by 4 matrix m (12 floats) to c.
KROM_FN void cce_apply(__CONSTANTREF__ float *m, const float *c, float *out) {
    for (int i = 0; i < 3; ++i) out[i] = m[4 * i] * c[0] + m[4 * i + 1] * c[1] + m[4 * i + 2] * c[2] + m[4 * i + 3];
}

/// A value clamped to 0..1 as a 16-bit value, rounded (NaN reads as 0).
KROM_FN int cce_16(float v) {
    const float c = v > 0.f ? (v < 1.f ? v : 1.f) : 0.f;
    return (int)(c * 65535.f + 0.5f);
}

/// The curves of bin k: L, R, G, B.
KROM_FN float4 cce_curves(__CONSTANTREF__ CCProcessEqualizeParams *q, __TEXTURE2D__ tables, int k) {
    return _tex2DVecN(tables, k % q->sampleWidth, k / q->sampleWidth, 0);
}

__KERNEL__ void CCProcessEqualize(__CONSTANTREF__ CCProcessEqualizeParams *p_pParams, __TEXTURE2D__ input,
                                  __TEXTURE2D__ tables, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ CCProcessEqualizeParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    float4 c = to_float4_v(q->processCanvasColor);
    if (IsInsideROI(pos, q->srcWindow)) {
        const float4 in = _tex2DVecN(input, pos.x - q->srcWindow[0], pos.y - q->srcWindow[2], q->srcCompOrder);
        float p[4] = {in.x, in.y, in.z, in.w};
        if (q->preDivide) {
            if (p[3] == 0.f)
                p[0] = p[1] = p[2] = 0.f;
            else
                for (int i = 0; i < 3; ++i) p[i] = p[i] / p[3];
        }
        int v[3] = {cce_16(p[0]), cce_16(p[1]), cce_16(p[2])};
        if (q->histogramBlendL > 0.f) {
            const float f[3] = {(float)v[0], (float)v[1], (float)v[2]};
            float l[3], back[3];
            cce_apply(q->colorMat, f, l);
            const float luma = l[0] > 0.f ? (l[0] < 65535.f ? l[0] : 65535.f) : 0.f;
            l[0] = cce_curves(q, tables, (int)(luma + 0.5f) >> q->shift).x;
            cce_apply(q->colorMat + 12, l, back);
            for (int i = 0; i < 3; ++i)
                v[i] = (int)((back[i] > 0.f ? (back[i] < 65535.f ? back[i] : 65535.f) : 0.f) + 0.5f);
        }
        p[0] = cce_curves(q, tables, v[0] >> q->shift).y / 65535.f;
        p[1] = cce_curves(q, tables, v[1] >> q->shift).z / 65535.f;
        p[2] = cce_curves(q, tables, v[2] >> q->shift).w / 65535.f;
        if (q->preDivide) {
            const float a = p[3] > -1e-6f && p[3] < 1e-6f ? 0.f : p[3];
            for (int i = 0; i < 3; ++i) p[i] = p[i] * a;
        }
        c = make_float4(p[0], p[1], p[2], p[3]);
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, q->dstCompOrder));
}
)KROM";

} // namespace Orvane
