// The Delta Keyer's kernels of the common library. Each is the per-pixel
// function of the keyer's row step of the same name, term for term and in the
// same float order, so that the device gives the rows' values. Every input is
// read through dk_read: its pixel inside its window, the block's stand-in
// outside it.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kDeltaKeyerKernels[] = R"KROM(
KROM_FN float4 dk_read(__TEXTURE2D__ img, int2 pos, __CONSTANTREF__ int *w, float4 def) {
    if (IsInsideROI(pos, w)) return _tex2DVecN(img, pos.x - w[0], pos.y - w[2], 0);
    return def;
}

KROM_FN float dk_clamp01(float v) { return _fminf(_fmaxf(v, 0.f), 1.f); }

KROM_FN float dk_matte(const DeltaKeyerScreenInfoParams *r, const float *p, __TEXTURE2D__ table, int samples) {
    float key = p[r->keyIndex];
    if (r->tuning && samples > 0) {
        const float x = key > 0.f ? (key < 1.f ? key : 1.f) : 0.f;
        const float4 w = _tex2DVecN(table, (int)(x * (float)(samples - 1) + 0.5f), 0, 0);
        key = key * r->shadowsGain * w.x + key * r->midtonesGain * w.y + key * r->highlightsGain * w.z;
    }
    const float d = r->offset * r->oneMinusFactors + r->denomBase;
    if (d == 0.f) return 0.f;
    return (key - (r->midFactor * p[r->midIndex] + r->lowFactor * p[r->lowIndex])) * r->gain / d;
}

KROM_FN void dk_clean(DeltaKeyerScreenInfoParams *r, const float *c) {
    r->background[0] = c[0];
    r->background[1] = c[1];
    r->background[2] = c[2];
    const float k = c[r->keyIndex], m = c[r->midIndex], l = c[r->lowIndex];
    r->denomBase = _fabs(k - (m * r->midFactor + l * r->lowFactor));
    r->offset = (m + k + l) * (r->gain - 1.f) / 3.f;
}

__KERNEL__ void DeltaKeyerScreen(__CONSTANTREF__ DeltaKeyerScreenParams *q, __TEXTURE2D__ input, __TEXTURE2D__ clean,
                                 __TEXTURE2D__ table, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstLeftBtm[0], y + q->dstLeftBtm[1]);
    const float4 s = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP));
    const float p[3] = {s.x, s.y, s.z};
    DeltaKeyerScreenInfoParams c = q->colorInfo, a = q->alphaInfo;
    if (q->doClean) {
        const float4 k = dk_read(clean, pos, q->cleanWindow, to_float4_v(q->defaultC));
        const float cc[3] = {k.x, k.y, k.z};
        dk_clean(&c, cc);
        dk_clean(&a, cc);
    }
    const float m = dk_matte(&c, p, table, q->ccSampleCount);
    float o[3];
    for (int i = 0; i < 3; ++i) o[i] = p[i] - _fminf(_fmaxf((c.background[i] + c.offset) * m, 0.f), p[i]);
    const float al = q->sameInfo ? m * c.gain : dk_matte(&a, p, table, q->ccSampleCount) * a.gain;
    const float alpha = dk_clamp01(_fmaxf(1.f - al, _fmaxf(o[0], _fmaxf(o[1], o[2]))));
    _tex2DVec4Write(output, x, y, make_float4(o[0], o[1], o[2], alpha));
}

__KERNEL__ void DeltaKeyerPreMatte(__CONSTANTREF__ DeltaKeyerPreMatteParams *q, __TEXTURE2D__ input,
                                   __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float4 s = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP));
    const float v[4] = {s.x, s.y, s.z, 0.299f * s.x + 0.587f * s.y + 0.114f * s.z};
    int inside = 1;
    for (int i = 0; i < 4; ++i) inside = inside && v[i] >= q->lowRGBL[i] && v[i] <= q->highRGBL[i];
    float e = 0.f;
    if (!inside) {
        if (!(q->soft > 0.f)) {
            e = 1.f;
        } else {
            for (int i = 0; i < 4; ++i) {
                const float out = _fmaxf(_fmaxf(v[i] - q->highRGBL[i], q->lowRGBL[i] - v[i]), 0.f);
                e = _fmaxf(e, _fminf(out, q->soft) / q->soft);
            }
        }
    }
    _tex2DVec4Write(output, x, y, make_float4(e, e, e, e));
}

__KERNEL__ void DeltaKeyerPreMatteCombine(__CONSTANTREF__ DeltaKeyerPreMatteCombineParams *q, __TEXTURE2D__ input,
                                          __TEXTURE2D__ preMatte, __TEXTURE2D__ clean, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float4 s = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP));
    const float a = dk_read(preMatte, pos, q->matteWindow, make_float4(0.f, 0.f, 0.f, q->defaultM)).w;
    float4 o = to_float4_v(q->defaultC);
    if (q->doClean) o = dk_read(clean, pos, q->cleanWindow, o);
    _tex2DVec4Write(output, x, y,
                    make_float4(s.x * a + o.x * (1.f - a), s.y * a + o.y * (1.f - a), s.z * a + o.z * (1.f - a), s.w));
}

__KERNEL__ void DeltaKeyerThreshold(__CONSTANTREF__ DeltaKeyerThresholdParams *q, __TEXTURE2D__ input,
                                    __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    float4 s = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP));
    const float lo = q->thresholdLow, hi = q->thresholdHigh;
    s.w = hi > lo ? _fminf(_fmaxf(s.w - lo, 0.f) / (hi - lo), 1.f) : (s.w > lo ? 1.f : 0.f);
    _tex2DVec4Write(output, x, y, s);
}

__KERNEL__ void DeltaKeyerRestoreFringe(__CONSTANTREF__ DeltaKeyerRestoreFringeParams *q, __TEXTURE2D__ input,
                                        __TEXTURE2D__ soft, __TEXTURE2D__ eroded, __TEXTURE2D__ dilated,
                                        __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    float4 s = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP));
    const float a = dk_read(soft, pos, q->softWindow, make_float4(0.f, 0.f, 0.f, q->defaultSoft)).w;
    float ae = q->defaultErode, ad = q->defaultDilate;
    if (q->isErode) ae = dk_read(eroded, pos, q->erodeWindow, make_float4(0.f, 0.f, 0.f, ae)).w;
    if (q->isDilate) ad = dk_read(dilated, pos, q->dilateWindow, make_float4(0.f, 0.f, 0.f, ad)).w;
    s.w = _fmaxf(ae, _fminf(a, ad));
    _tex2DVec4Write(output, x, y, s);
}

/// The colour f rebuilt from source s for alpha moving from a0 to a1 (mode 1
/// Source, 2 Hard Color, 3 Soft Color with colour c).
KROM_FN void dk_replace(int mode, const float *s, float a0, float a1, __CONSTANTREF__ float *c, float *f) {
    const float da = a1 - a0;
    if (!(da > 0.f)) {
        const float k = a0 == 0.f ? 0.f : a1 / a0;
        for (int i = 0; i < 3; ++i) f[i] = f[i] * k;
    } else if (mode == 1) {
        const float t = a0 >= 0.9999999f ? 0.f : da / (1.f - a0);
        for (int i = 0; i < 3; ++i) f[i] = f[i] + (s[i] - f[i]) * t;
    } else if (mode == 2) {
        for (int i = 0; i < 3; ++i) f[i] = f[i] + da * c[i];
    } else {
        const float d = ((s[0] - f[0]) + (s[1] - f[1]) + (s[2] - f[2])) * da / 3.f;
        for (int i = 0; i < 3; ++i) f[i] = f[i] + d * c[i];
    }
}

__KERNEL__ void DeltaKeyerReplace(__CONSTANTREF__ DeltaKeyerReplaceParams *q, __TEXTURE2D__ source,
                                  __TEXTURE2D__ before, __TEXTURE2D__ after, __TEXTURE2D__ input,
                                  __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float4 f4 = dk_read(input, pos, q->colorWindow, to_float4_v(q->defaultF));
    float f[3] = {f4.x, f4.y, f4.z};
    if (q->mode != 0) {
        const float4 s4 = dk_read(source, pos, q->srcWindow, to_float4_v(q->sp));
        const float s[3] = {s4.x, s4.y, s4.z};
        const float a0 = dk_read(before, pos, q->preWindow, make_float4(0.f, 0.f, 0.f, q->preMatte)).w;
        const float a1 = dk_read(after, pos, q->matteWindow, make_float4(0.f, 0.f, 0.f, q->matte)).w;
        dk_replace(q->mode, s, a0, a1, q->replace, f);
    }
    _tex2DVec4Write(output, x, y, make_float4(f[0], f[1], f[2], f4.w));
}

__KERNEL__ void DeltaKeyerMaskMerge(__CONSTANTREF__ DeltaKeyerMaskMergeParams *q, __TEXTURE2D__ mask,
                                    __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    float4 d = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultD));
    float s = dk_read(mask, pos, q->maskWindow, make_float4(0.f, 0.f, 0.f, q->defaultS)).w;
    if (q->invertMask) s = 1.f - s;
    d.w = q->isInvert ? (1.f - d.w) * (1.f - s) + s : (1.f - s) * d.w + s;
    _tex2DVec4Write(output, x, y, d);
}

__KERNEL__ void DeltaKeyerColorMax(__CONSTANTREF__ DeltaKeyerColorMaxParams *q, __TEXTURE2D__ key,
                                   __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    float4 d = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP));
    float k = q->defaultKey;
    if (q->isKey) k = dk_read(key, pos, q->keyWindow, make_float4(0.f, 0.f, 0.f, k)).w;
    d.w = dk_clamp01(_fmaxf(_fmaxf(d.w, k), _fmaxf(d.x, _fmaxf(d.y, d.z))));
    _tex2DVec4Write(output, x, y, d);
}
KROM_FN float dk_level(float a) { return a < 0.001f ? 0.f : (a > 0.9999f ? 1.f : 0.5f); }

KROM_FN float4 dk_tint(float4 p, float r, float g, float b) {
    return make_float4(0.5f * p.x + 0.5f * r, 0.5f * p.y + 0.5f * g, 0.5f * p.z + 0.5f * b, p.w);
}

__KERNEL__ void DeltaKeyerReplaceMask(__CONSTANTREF__ DeltaKeyerReplaceMaskParams *q, __TEXTURE2D__ source,
                                      __TEXTURE2D__ before, __TEXTURE2D__ mask, __TEXTURE2D__ input,
                                      __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float4 f4 = dk_read(input, pos, q->colorWindow, to_float4_v(q->defaultF));
    float f[3] = {f4.x, f4.y, f4.z};
    float m = dk_read(mask, pos, q->maskWindow, make_float4(0.f, 0.f, 0.f, q->mask)).w;
    if (q->isInvert) m = 1.f - m;
    if (q->mode != 0 && m > 0.f) {
        const float4 s4 = dk_read(source, pos, q->srcWindow, to_float4_v(q->sp));
        const float s[3] = {s4.x, s4.y, s4.z};
        const float a0 = dk_read(before, pos, q->preWindow, make_float4(0.f, 0.f, 0.f, q->key)).w;
        dk_replace(q->mode, s, a0, f4.w, q->colors, f);
    }
    _tex2DVec4Write(output, x, y, make_float4(f[0], f[1], f[2], f4.w));
}

__KERNEL__ void DeltaKeyerStatusDiff(__CONSTANTREF__ DeltaKeyerStatusDiffParams *q, __TEXTURE2D__ before,
                                     __TEXTURE2D__ after, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float a0 = dk_read(before, pos, q->preWindow, make_float4(0.f, 0.f, 0.f, q->preMatte)).w;
    const float a1 = dk_read(after, pos, q->matteWindow, make_float4(0.f, 0.f, 0.f, q->matte)).w;
    const float d = a1 - a0;
    _tex2DVec4Write(output, x, y, make_float4(d, d, d, d));
}

__KERNEL__ void DeltaKeyerStatus(__CONSTANTREF__ DeltaKeyerStatusParams *q, __TEXTURE2D__ input, __TEXTURE2D__ diff,
                                 __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float a = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP)).w;
    const float g = dk_level(q->isInvert ? 1.f - a : a);
    float4 o = make_float4(g, g, g, a);
    const float w = q->isDiff ? dk_read(diff, pos, q->diffWindow, make_float4(0.f, 0.f, 0.f, q->diff)).w : 0.f;
    if (w >= 0.001f) o = dk_tint(o, 1.f, 1.f, 0.f);
    if (w <= -0.001f) o = dk_tint(o, 0.f, 0.f, 1.f);
    _tex2DVec4Write(output, x, y, o);
}

// The solid (adds m (1 - a): green) and garbage (takes m a: red) tints; the
// two blocks have the same fields.
#define DK_STATUS_MASK(solid)                                                                                    \
    DEFINE_KERNEL_ITERATORS_XY(x, y);                                                                            \
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;                                                      \
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);                                        \
    float4 o = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP));                                      \
    float m = dk_read(mask, pos, q->maskWindow, make_float4(0.f, 0.f, 0.f, q->mask)).w;                          \
    if (q->isInvert) m = 1.f - m;                                                                                \
    if (m * (solid ? 1.f - o.w : o.w) >= 0.001f) o = dk_tint(o, solid ? 0.f : 1.f, solid ? 1.f : 0.f, 0.f);      \
    _tex2DVec4Write(output, x, y, o)

__KERNEL__ void DeltaKeyerStatusSolid(__CONSTANTREF__ DeltaKeyerStatusSolidParams *q, __TEXTURE2D__ input,
                                      __TEXTURE2D__ mask, __TEXTURE2D_WRITE__ output) {
    DK_STATUS_MASK(1);
}

__KERNEL__ void DeltaKeyerStatusGarbage(__CONSTANTREF__ DeltaKeyerStatusGarbageParams *q, __TEXTURE2D__ input,
                                        __TEXTURE2D__ mask, __TEXTURE2D_WRITE__ output) {
    DK_STATUS_MASK(0);
}

__KERNEL__ void DeltaKeyerRangesToColor(__CONSTANTREF__ DeltaKeyerRangesToColorParams *q, __TEXTURE2D__ input,
                                        __TEXTURE2D__ table, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float4 s = dk_read(input, pos, q->srcWindow, to_float4_v(q->defaultP));
    const float c[4] = {s.x, s.y, s.z, s.w};
    float v = c[0];
    for (int i = 1; i < q->maxChannels; ++i) v = _fmaxf(v, c[i]);
    const float t = v > 0.f ? (v < 1.f ? v : 1.f) : 0.f;
    const float4 w = _tex2DVecN(table, (int)(t * (float)(q->ccSampleCount - 1) + 0.5f), 0, 0);
    _tex2DVec4Write(output, x, y, make_float4(w.x, w.y, w.z, 1.f));
}

__KERNEL__ void DeltaKeyerAlphaToColor(__CONSTANTREF__ DeltaKeyerAlphaToColorParams *q, __TEXTURE2D__ input,
                                       __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float a = dk_read(input, pos, q->srcWindow, make_float4(0.f, 0.f, 0.f, q->alpha)).w;
    const float v = q->isInvert ? 1.f - a : a;
    _tex2DVec4Write(output, x, y, make_float4(v, v, v, a));
}

__KERNEL__ void DeltaKeyerCopyColor(__CONSTANTREF__ DeltaKeyerCopyColorParams *q, __TEXTURE2D__ source,
                                    __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float4 s = dk_read(source, pos, q->srcWindow, to_float4_v(q->defaultP));
    const float4 d = dk_read(input, pos, q->colorWindow, to_float4_v(q->defaultD));
    _tex2DVec4Write(output, x, y, make_float4(s.x, s.y, s.z, d.w));
}

__KERNEL__ void DeltaKeyerSourceAlpha(__CONSTANTREF__ DeltaKeyerSourceAlphaParams *q, __TEXTURE2D__ source,
                                      __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->dstWindow[0], y + q->dstWindow[2]);
    const float a = dk_read(source, pos, q->srcWindow, make_float4(0.f, 0.f, 0.f, q->alpha)).w;
    float4 o = make_float4(a, a, a, 1.f);
    if (q->mode != 0) {
        const float k = 1.f - a;
        const float4 d = dk_read(input, pos, q->colorWindow, to_float4_v(q->defaultD));
        o = make_float4(d.x * k, d.y * k, d.z * k, d.w * k);
    }
    _tex2DVec4Write(output, x, y, o);
}
)KROM";

} // namespace Orvane
