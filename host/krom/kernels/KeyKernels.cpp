// The keyers' first-matte kernels of the common library: the float forms of
// operators/key/KeyFunctions.h, in the same order of operations.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kChromaKeyerKernel[] = R"KROM(
KROM_FN float ck_alpha(__CONSTANTREF__ ChromaKeyerParams *q, float r, float g, float b) {
    const float y = 0.299f * r + 0.587f * g + 0.114f * b;
    float v[4];
    if (q->key == 0) {
        v[0] = (r - y) * 0.61035f + 0.5f;
        v[1] = (g - y) * 0.76294f + 0.5f;
        v[2] = (b - y) * 0.45776f + 0.5f;
    } else {
        v[0] = r;
        v[1] = g;
        v[2] = b;
    }
    v[3] = y;
    int inside = 1;
    for (int i = 0; i < 4; ++i) inside = inside && v[i] >= q->lowRGBL[i] && v[i] <= q->highRGBL[i];
    if (inside) return 0.f;
    if (!(q->soft > 0.f)) return 1.f;
    float a = 0.f;
    for (int i = 0; i < 4; ++i)
        a = _fmaxf(a, _fminf(_fmaxf(_fmaxf(v[i] - q->highRGBL[i], q->lowRGBL[i] - v[i]), 0.f), q->soft) / q->soft);
    return a;
}

__KERNEL__ void ChromaKeyer(__CONSTANTREF__ ChromaKeyerParams *p_pParams, __TEXTURE2D__ input,
                            __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ ChromaKeyerParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    float4 c = to_float4_v(q->defaultP);
    if (IsInsideROI(pos, q->srcWindow)) {
        c = _tex2DVecN(input, pos.x - q->srcWindow[0], pos.y - q->srcWindow[2], q->srcCompOrder);
        c.w = ck_alpha(q, c.x, c.y, c.z);
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, q->dstCompOrder));
}
)KROM";

const char kLumaKeyKernel[] = R"KROM(
KROM_FN float lk_value(int channel, float4 c) {
    if (channel == 0) return c.z;
    if (channel == 1) return c.y;
    if (channel == 2) return c.x;
    if (channel == 3) return c.w;
    if (channel == 5 || channel == 6) {
        const float mx = _fmaxf(c.x, _fmaxf(c.y, c.z)), mn = _fminf(c.x, _fminf(c.y, c.z)), d = mx - mn;
        if (d <= 1e-6f) return 0.f;
        if (channel == 5) return d / mx;
        float h;
        if (_fabs(c.x - mx) <= 1e-6f)
            h = (c.y - c.z) * 0.5f / d;
        else if (_fabs(c.y - mx) <= 1e-6f)
            h = (c.z - c.x) * 0.5f / d + 1.f;
        else
            h = (c.x - c.y) * 0.5f / d + 2.f;
        h = h / 3.f;
        return h < 0.f ? h + 1.f : h;
    }
    return 0.299f * c.x + 0.587f * c.y + 0.114f * c.z;
}

__KERNEL__ void LumaKey(__CONSTANTREF__ LumaKeyParams *p_pParams, __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ LumaKeyParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstLeft, y + q->dstBottom);
    float4 c = to_float4_v(q->p);
    if (IsInsideROI(pos, q->srcWindow)) {
        c = _tex2DVecN(input, pos.x - q->srcWindow[0], pos.y - q->srcWindow[2], q->srcCompOrder);
        const float v = lk_value(q->channelID, c);
        c.w = v <= q->low ? 0.f : (v >= q->high ? 1.f : (v - q->low) * q->diff);
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, q->dstCompOrder));
}
)KROM";

const char kDifferenceKeyerKernel[] = R"KROM(
__KERNEL__ void DifferenceKeyer(__CONSTANTREF__ DifferenceKeyerParams *p_pParams, __TEXTURE2D__ input,
                                __TEXTURE2D__ foreground, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ DifferenceKeyerParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->outDataWindow[0], y + q->outDataWindow[2]);
    float4 c = to_float4_v(q->sp);
    if (IsInsideROI(pos, q->inDataWindow))
        c = _tex2DVecN(input, pos.x - q->inDataWindow[0], pos.y - q->inDataWindow[2], q->srcCompOrder);
    const float4 f = _tex2DVecN(foreground, x, y, q->srcCompOrder);
    const float d = _fmaxf(_fabs(f.x - c.x), _fmaxf(_fabs(f.y - c.y), _fabs(f.z - c.z)));
    c.w = d <= q->lo ? 0.f : (d >= q->hi ? 1.f : (d - q->lo) * q->dif);
    _tex2DVec4Write(output, x, y, make_intensity(c, q->dstCompOrder));
}
)KROM";

} // namespace Orvane
