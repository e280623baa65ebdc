// Keyer kernels of the common library. Each does the float rows of the
// keyer's steps (operators/key/UltraKeyerSteps.cpp) step for step and in the
// same float order, so float images get the rows' bits. On integer images the
// pre-matte takes the rows' 16-bit axes (a box has sharp edges, so both paths
// must agree on every pixel); the soft matte and the steps after it stay in
// float there, within a few codes of the rows' fixed point.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kUltraKeyerKernel[] = R"KROM(
/// The pre-matte: 0 inside the box on the four axes, 1 outside. Integer
/// images take the 16-bit axes against the limits in 16-bit steps, as their
/// rows do; float images the float axes.
KROM_FN int uk_code(float v) { return (int)_floorf(_fminf(_fmaxf(v * 65535.f + 0.5f, -1.f), 65536.f)); }

KROM_FN int uk_axis16(int c, int y, int k) {
    const int v = (((c - y) * k) >> 15) + 32768;
    return v < 0 ? 0 : (v > 65535 ? 65535 : v);
}

KROM_FN float uk_prematte(__CONSTANTREF__ UltraKeyerParams *p, float4 c) {
    if (((p->dstCompOrder >> 4) & 3) < 2) {
        const int r = uk_code(c.x), g = uk_code(c.y), b = uk_code(c.z);
        const int y = (19235 * g + 9797 * r + 3736 * b) >> 15;
        const int ar = uk_axis16(r, y, 20000), ag = uk_axis16(g, y, 25000), ab = uk_axis16(b, y, 15000);
        const int inside = ar >= uk_code(p->lowR) && ar <= uk_code(p->highR) && ag >= uk_code(p->lowG) &&
                           ag <= uk_code(p->highG) && ab >= uk_code(p->lowB) && ab <= uk_code(p->highB) &&
                           y >= uk_code(p->lowLum) && y <= uk_code(p->highLum);
        return inside ? 0.f : 1.f;
    }
    const float y = 0.299f * c.x + 0.587f * c.y + 0.114f * c.z;
    const float r = (c.x - y) * 0.61035f + 0.5f;
    const float g = (c.y - y) * 0.76294f + 0.5f;
    const float b = (c.z - y) * 0.45776f + 0.5f;
    const int inside = r >= p->lowR && r <= p->highR && g >= p->lowG && g <= p->highG && b >= p->lowB &&
                       b <= p->highB && y >= p->lowLum && y <= p->highLum;
    return inside ? 0.f : 1.f;
}

__KERNEL__ void UltraKeyer(__CONSTANTREF__ UltraKeyerParams *p_pParams, __TEXTURE2D__ input,
                           __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int2 pos = make_int2(x + p_pParams->outDataWindow[0], y + p_pParams->outDataWindow[2]);
    float4 c = to_float4_v(p_pParams->dp);
    if (IsInsideROI(pos, p_pParams->inDataWindow)) {
        c = _tex2DVecN(input, pos.x - p_pParams->inDataWindow[0], pos.y - p_pParams->inDataWindow[2],
                       p_pParams->srcCompOrder);
        c.w = uk_prematte(p_pParams, c);
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, p_pParams->dstCompOrder));
}
)KROM";

const char kUltraKeyerSoftKernel[] = R"KROM(
KROM_FN float uk_clamp01(float x) { return _fminf(_fmaxf(x, 0.f), 1.f); }

/// (c0 - (w1 c1 + w2 c2)) / bgDiv, 0 when bgDiv is 0.
KROM_FN float uk_raw(__CONSTANTREF__ UltraKeyerSoftParams *p, const float *c) {
    if (p->bgDiv == 0.f) return 0.f;
    return (c[0] - (p->bgScale[0] * c[1] + p->bgScale[1] * c[2])) / p->bgDiv;
}

/// The position of the ordered component i for key channel k: blue B, R, G;
/// green G, R, B; red R, G, B.
KROM_FN int uk_order(int k, int i) {
    if (k == 0) return i == 0 ? 2 : i - 1;
    if (k == 1) return i == 0 ? 1 : (i == 1 ? 0 : 2);
    return i;
}

KROM_FN float4 uk_soft(__CONSTANTREF__ UltraKeyerSoftParams *p, float4 in) {
    const float src[3] = {in.x, in.y, in.z};
    float test[3] = {in.x, in.y, in.z};
    if (p->satr != 0.f) {
        const float y = 0.299f * in.x + 0.587f * in.y + 0.114f * in.z;
        for (int i = 0; i < 3; ++i) test[i] = p->sat * test[i] - p->satr * y;
    }
    float c[3], b[3];
    for (int i = 0; i < 3; ++i) {
        c[i] = test[uk_order(p->vlColor, i)];
        b[i] = p->bgVal[uk_order(p->vlColor, i)];
    }
    float raw = uk_raw(p, c);
    float a = 1.f - uk_clamp01(raw);
    if (p->passes > 0 && p->bgDiv != 0.f) {
        float s = p->correction;
        for (int pass = 0; pass < p->passes; ++pass) {
            const float t = _fminf(1.f, s);
            s = s - t;
            const float a2 = a * t + (1.f - t);
            for (int i = 0; i < 3; ++i) c[i] = a2 * c[i] + (1.f - a2) * b[i];
            raw = uk_raw(p, c);
            a = 1.f - uk_clamp01(raw);
        }
    }
    if (!p->sub) return make_float4(in.x, in.y, in.z, a);
    const float m = raw * p->subSub;
    const float k = uk_clamp01(1.f - m * p->subMul);
    float out[3];
    for (int i = 0; i < 3; ++i) out[i] = (src[i] - _fminf(_fmaxf(p->bgVal[i] * m, 0.f), src[i])) * k;
    const float alpha = uk_clamp01(_fmaxf(a, _fmaxf(out[0], _fmaxf(out[1], out[2]))));
    return make_float4(out[0], out[1], out[2], alpha);
}

__KERNEL__ void UltraKeyerSoft(__CONSTANTREF__ UltraKeyerSoftParams *p_pParams, __TEXTURE2D__ input,
                               __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int2 pos = make_int2(x + p_pParams->outDataWindow[0], y + p_pParams->outDataWindow[2]);
    float4 c = to_float4_v(p_pParams->dp);
    if (IsInsideROI(pos, p_pParams->inDataWindow))
        c = uk_soft(p_pParams, _tex2DVecN(input, pos.x - p_pParams->inDataWindow[0],
                                          pos.y - p_pParams->inDataWindow[2], p_pParams->srcCompOrder));
    _tex2DVec4Write(output, x, y, make_intensity(c, p_pParams->dstCompOrder));
}
)KROM";

const char kUltraKeyerCombineKernel[] = R"KROM(
__KERNEL__ void UltraKeyerCombine(__CONSTANTREF__ UltraKeyerCombineParams *p_pParams, __TEXTURE2D__ input,
                                  __TEXTURE2D__ work, __TEXTURE2D_WRITE__ output, __TEXTURE2D_WRITE__ outputWork) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int2 pos = make_int2(x + p_pParams->outDataWindow[0], y + p_pParams->outDataWindow[2]);
    float4 d = _tex2DVecN(input, x, y, p_pParams->srcCompOrder);
    float4 w = make_float4(0.f, 0.f, 0.f, p_pParams->spw);
    const int inWork = IsInsideROI(pos, p_pParams->inDataWindow);
    if (inWork)
        w = _tex2DVecN(work, pos.x - p_pParams->inDataWindow[0], pos.y - p_pParams->inDataWindow[2],
                       p_pParams->dstCompOrder);
    const float old = d.w;
    d.w = d.w * w.w;
    w.w = old;
    _tex2DVec4Write(output, x, y, make_intensity(d, p_pParams->dstCompOrder));
    if (inWork) _tex2DVec4Write(outputWork, x, y, make_intensity(w, p_pParams->dstCompOrder));
}
)KROM";

const char kUltraKeyerSubtractKernel[] = R"KROM(
/// One colour component of the subtract step.
KROM_FN float uk_restore(float c, float s, float a0, float a1) {
    if (a1 > a0) {
        const float t = a0 < 1.f ? (a1 - a0) / (1.f - a0) : 1.f;
        return _fminf(c + (s - c) * t, s);
    }
    if (a1 < a0) return a0 == 0.f ? 0.f : c * a1 / a0;
    return c;
}

__KERNEL__ void UltraKeyerSubtract(__CONSTANTREF__ UltraKeyerSubtractParams *p_pParams, __TEXTURE2D__ src,
                                   __TEXTURE2D__ input, __TEXTURE2D__ old, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int2 pos = make_int2(x + p_pParams->outDataWindow[0], y + p_pParams->outDataWindow[2]);
    float4 s = to_float4_v(p_pParams->sp);
    if (IsInsideROI(pos, p_pParams->inDataWindow))
        s = _tex2DVecN(src, pos.x - p_pParams->inDataWindow[0], pos.y - p_pParams->inDataWindow[2],
                       p_pParams->srcCompOrder);
    float4 c = _tex2DVecN(input, x, y, p_pParams->dstCompOrder);
    const float a0 = _tex2DVecN(old, x, y, p_pParams->dstCompOrder).w;
    c.x = uk_restore(c.x, s.x, a0, c.w);
    c.y = uk_restore(c.y, s.y, a0, c.w);
    c.z = uk_restore(c.z, s.z, a0, c.w);
    _tex2DVec4Write(output, x, y, make_intensity(c, p_pParams->dstCompOrder));
}
)KROM";

} // namespace Orvane
