// The Lens Distort kernel of the common library: the Distort mode, where every
// output sample reads the source at the lens model's direct function, no
// iteration. Per output pixel, n x n samples at (i + 0.5) / n; each is taken
// to the model's unit coordinates by one affine map per axis (the tool folds
// the image-to-filmback normalisation and the unit scaling into it), and the
// chain's displacement there comes back as an offset in pixels. The offset is
// computed without cancelling large terms and the read position is kept as
// the output pixel (an integer) plus a small float, so float arithmetic keeps
// positions to a fraction of a millionth of the offset rather than of the
// image's size. The reads follow the host's EdgeSampler: bilinear taps of
// weight 0 are not read, taps off the read window take the canvas colour or,
// duplicating, the border pixel.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kLensDistortKernel[] = R"KROM(
KROM_FN int lens_finite(float v) { return v - v == 0.f; }

/// The chain's displacement at unit position (u, v): outer poly(inner (u, v)) - (u, v).
KROM_FN void lens_displacement(__CONSTANTREF__ LensDistortParams *q, float u, float v, float *du, float *dv) {
    const float x = q->inner[0] * u + q->inner[1] * v, y = q->inner[2] * u + q->inner[3] * v;
    const float x2 = x * x, y2 = y * y;
    float ex, ey; // poly(x, y) - (x, y)
    if (q->polynomial == 0) {
        const float r2 = x2 + y2;
        const float k = r2 * (q->coeffX[0] + r2 * q->coeffX[3]);
        const float a = q->coeffX[1] + q->coeffX[4] * r2, b = q->coeffX[2] + q->coeffX[5] * r2;
        ex = k * x + (r2 + 2.f * x2) * a + 2.f * x * y * b;
        ey = k * y + (r2 + 2.f * y2) * b + 2.f * x * y * a;
    } else {
        const float x4 = x2 * x2, y4 = y2 * y2;
        const float m[9] = {x2, y2, x4, x2 * y2, y4, x4 * x2, x4 * y2, x2 * y4, y4 * y2};
        float px = 0.f, py = 0.f;
        for (int k = 0; k < q->terms; ++k) {
            px += q->coeffX[k] * m[k];
            py += q->coeffY[k] * m[k];
        }
        ex = x * px;
        ey = y * py;
    }
    *du = q->outer[0] * ex + q->outer[1] * ey + (q->mix[0] * u + q->mix[1] * v);
    *dv = q->outer[2] * ex + q->outer[3] * ey + (q->mix[2] * u + q->mix[3] * v);
}

/// Source pixel (i, j) under the edge rule.
KROM_FN float4 lens_pixel(__CONSTANTREF__ LensDistortParams *q, __TEXTURE2D__ input, int i, int j) {
    const int x0 = q->readWindow[0], x1 = q->readWindow[1], y0 = q->readWindow[2], y1 = q->readWindow[3];
    if (q->duplicate && x0 < x1 && y0 < y1) {
        i = i < x0 ? x0 : (i >= x1 ? x1 - 1 : i);
        j = j < y0 ? y0 : (j >= y1 ? y1 - 1 : j);
    }
    const int2 pos = make_int2(i, j);
    if (IsInsideROI(pos, q->readWindow) && IsInsideROI(pos, q->srcWindow))
        return _tex2DVecN(input, i - q->srcWindow[0], j - q->srcWindow[2], q->srcCompOrder);
    return to_float4_v(q->canvas);
}

/// Beyond this every rule gives the tap at this distance, and the conversion to int stays defined.
#define LENS_FAR 268435456.f
KROM_FN int lens_far_tap(float v) { return v > 0.f ? 268435456 : -268435456; }

/// The source at (x + gx, y + gy), bilinear or nearest.
KROM_FN float4 lens_read(__CONSTANTREF__ LensDistortParams *q, __TEXTURE2D__ input, int x, int y, float gx,
                         float gy) {
    const float fx = q->bilinear ? gx - 0.5f : gx, fy = q->bilinear ? gy - 0.5f : gy;
    const float farX = (float)x + fx, farY = (float)y + fy;
    if (!(_fabs(farX) < LENS_FAR && _fabs(farY) < LENS_FAR) || !(_fabs(fx) < LENS_FAR && _fabs(fy) < LENS_FAR))
        return lens_pixel(q, input, lens_far_tap(farX), lens_far_tap(farY));
    const float flx = _floorf(fx), fly = _floorf(fy);
    const int i = x + (int)flx, j = y + (int)fly;
    if (!q->bilinear) return lens_pixel(q, input, i, j);
    const float ax = fx - flx, ay = fy - fly;
    const float wx[2] = {1.f - ax, ax}, wy[2] = {1.f - ay, ay};
    float4 sum = make_float4(0.f, 0.f, 0.f, 0.f);
    for (int b = 0; b < 2; ++b)
        for (int a = 0; a < 2; ++a) {
            const float w = wx[a] * wy[b];
            if (w != 0.f) sum = sum + w * lens_pixel(q, input, i + a, j + b);
        }
    return sum;
}

__KERNEL__ void LensDistort(__CONSTANTREF__ LensDistortParams *p_pParams, __TEXTURE2D__ input,
                            __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    __CONSTANTREF__ LensDistortParams *q = p_pParams;
    const int px = x + q->outDataWindow[0], py = y + q->outDataWindow[2];
    const int n = q->samples;
    const float step = 1.f / (float)n;
    float4 sum = make_float4(0.f, 0.f, 0.f, 0.f);
    float offX = 0.f, offY = 0.f;
    int kept = 0;
    for (int j = 0; j < n; ++j)
        for (int i = 0; i < n; ++i) {
            // The sample within its pixel; its distance from the centre is exact in float.
            const float fx = ((float)i + 0.5f) * step, fy = ((float)j + 0.5f) * step;
            const float u = (((float)px - q->centre[0]) + fx) * q->scale[0] + q->shift[0];
            const float v = (((float)py - q->centre[1]) + fy) * q->scale[1] + q->shift[1];
            float du, dv;
            lens_displacement(q, u, v, &du, &dv);
            const float dx = du * q->invScale[0], dy = dv * q->invScale[1];
            if (!lens_finite(dx) || !lens_finite(dy)) continue; // the rows drop such a sample too
            ++kept;
            if (q->distortionMap) {
                offX += dx;
                offY += dy;
            } else {
                sum = sum + lens_read(q, input, px, py, fx + dx, fy + dy);
            }
        }
    float4 out = make_float4(0.f, 0.f, 0.f, 0.f);
    if (kept > 0) {
        const float scale = 1.f / (float)kept;
        out = q->distortionMap ? make_float4(offX * scale, offY * scale, 0.f, 1.f) : sum * scale;
    }
    _tex2DVec4Write(output, x, y, make_intensity(out, q->dstCompOrder));
}
)KROM";

} // namespace Orvane
