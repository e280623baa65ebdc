// Generator kernels of the common library. "Background" follows the
// generator's float rows step for step (same float order, same results);
// "BackgroundGrad" keeps the device form of the gradient: positions from
// width - 1 and height - 1, the sub-sample row step added before the aspect
// scaling, and colours read from a 256-entry table through a linear sampler.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kBackgroundKernel[] = R"KROM(
__KERNEL__ void Background(__CONSTANTREF__ BackgroundParams *p_pParams, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int2 pos = make_int2(x + p_pParams->imgDataWindow[0], y + p_pParams->imgDataWindow[2]);
    const int mode = p_pParams->mode;
    const float v = (float)pos.y / (float)p_pParams->imgSize[1];
    const float4 tl = to_float4_v(p_pParams->tl), tr = to_float4_v(p_pParams->tr);
    const float4 bl = to_float4_v(p_pParams->bl), br = to_float4_v(p_pParams->br);
    float4 left = tl, right = tl;
    if (mode == 1) {
        right = tr;
    } else if (mode == 2) {
        left = bl * (1.0f - v) + tl * v;
        right = left;
    } else if (mode >= 3) {
        left = bl * (1.0f - v) + tl * v;
        right = br * (1.0f - v) + tr * v;
    }
    float4 c = left;
    if (left.x != right.x || left.y != right.y || left.z != right.z || left.w != right.w) {
        const float perColumn = p_pParams->imgSize[0] > 0 ? 1.0f / (float)p_pParams->imgSize[0] : 0.0f;
        const float u = (float)pos.x * perColumn, w = 1.0f - u;
        c = left * w + right * u;
    }
    _tex2DVec4Write(output, x, y, make_intensity(c, p_pParams->dstCompOrder));
}
)KROM";

const char kBackgroundGradKernel[] = R"KROM(
KROM_FN float bg_position(__CONSTANTREF__ BackgroundGradParams *q, float px, float py, float L2) {
    const float dx = q->end[0] - q->start[0], dy = q->end[1] - q->start[1];
    const float ox = px - q->start[0], oy = py - q->start[1];
    const float a = (dx * ox + dy * oy) / L2, b = (-dy * ox + dx * oy) / L2;
    if (q->type == 0) return a;
    if (q->type == 1) return _fabs(a);
    if (q->type == 2) return _fmaxf(_fabs(a), _fabs(b));
    if (q->type == 3) return _fminf(_fabs(a), _fabs(b));
    const float L = _sqrtf(L2);
    const float rx = px / L - q->start[0] / L;
    const float r = _sqrtf(rx * rx + oy * oy / L2);
    if (q->type == 4) return r;
    const float c = r != 0.0f ? a / r : 0.0f;
    if (c <= -1.0f) return 0.5f;
    if (c >= 1.0f) return 0.0f;
    const float turn = _acosf(c) / 6.2831852f;
    return b >= 0.0f ? turn : 1.0f - turn;
}

__KERNEL__ void BackgroundGrad(__CONSTANTREF__ BackgroundGradParams *p_pParams, __TEXTURE2D__ p_Grad,
                               __TEXTURE2D_WRITE__ output, __SAMPLER__ RowSampler) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int2 pos = make_int2(x + p_pParams->imgDataWindow[0], y + p_pParams->imgDataWindow[2]);
    const float dx = p_pParams->end[0] - p_pParams->start[0], dy = p_pParams->end[1] - p_pParams->start[1];
    const float L2 = dx * dx + dy * dy;
    const int n = p_pParams->subpixel;
    const float fn = (float)n;
    const float sx = (float)(p_pParams->imgSize[0] > 0 ? p_pParams->imgSize[0] : 1);
    const float sy = (float)(p_pParams->imgSize[1] > 0 ? p_pParams->imgSize[1] : 1);
    float4 sum = make_float4(0.f, 0.f, 0.f, 0.f);
    for (int i = 0; i < n; ++i) {
        for (int j = 0; j < n; ++j) {
            float t = 0.0f;
            if (_sqrtf(L2) >= 1.1920929e-07f) {
                const float px = ((float)pos.x + (float)j / fn) / sx;
                const float py = p_pParams->aspect * (((float)pos.y + (float)i / fn) / sy);
                t = bg_position(p_pParams, px, py, L2) - p_pParams->offset;
                if (p_pParams->repeat == 1) {
                    t = _fmodf(t, 1.0f);
                    if (t < 0.0f) t += 1.0f;
                } else if (p_pParams->repeat == 2) {
                    t = _fmodf(t, 2.0f);
                    if (t < 0.0f) t += 2.0f;
                    if (t > 1.0f) t = 2.0f - t;
                }
            }
            sum = sum + _tex2DSample(p_Grad, RowSampler, t, 0.5f);
        }
    }
    _tex2DVec4Write(output, x, y, make_intensity(sum * (1.0f / (fn * fn)), p_pParams->dstCompOrder));
}
)KROM";

} // namespace Orvane
