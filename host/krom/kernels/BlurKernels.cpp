// Blur kernels of the common library: the two passes of a separable blur
// with finite reach, as Image::BlurTagList runs them on rows. Weights come as
// one-channel float tables; each output sums them in tap order.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kBlurRowsKernel[] = R"KROM(
__KERNEL__ void BlurRows(__CONSTANTREF__ BlurRowsParams *p_pParams, __TEXTURE2D__ input, __TEXTURE2D__ weights,
                         __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ BlurRowsParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int px = x + q->outWindow[0], py = y + q->outWindow[2];
    const float4 canvas = to_float4_v(q->canvas);
    float4 sum = make_float4(0.f, 0.f, 0.f, 0.f);
    for (int k = 0; k <= 2 * q->radius; ++k) {
        const int2 at = make_int2(px - q->radius + k, py);
        const float w = _tex2DVecN(weights, k, 0, 8).x;
        float4 v = canvas;
        if (IsInsideROI(at, q->haveWindow))
            v = _tex2DVecN(input, at.x - q->inDataWindow[0], at.y - q->inDataWindow[2], q->srcCompOrder);
        sum = sum + v * w;
    }
    _tex2DVec4Write(output, x, y, sum);
}
)KROM";

const char kBlurColumnsKernel[] = R"KROM(
__KERNEL__ void BlurColumns(__CONSTANTREF__ BlurColumnsParams *p_pParams, __TEXTURE2D__ across, __TEXTURE2D__ input,
                            __TEXTURE2D__ weights, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ BlurColumnsParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->outWindow[0], y + q->outWindow[2]);
    const float4 canvas = to_float4_v(q->canvas);
    float4 sum = make_float4(0.f, 0.f, 0.f, 0.f);
    for (int k = 0; k <= 2 * q->radius; ++k) {
        const int ty = pos.y - q->radius + k;
        const float w = _tex2DVecN(weights, k, 0, 8).x;
        float4 v = canvas;
        if (ty >= q->tmpWindow[2] && ty < q->tmpWindow[3]) v = _tex2DVecN(across, x, ty - q->tmpWindow[2], 15);
        sum = sum + v * w;
    }
    float4 base = canvas;
    if (IsInsideROI(pos, q->inDataWindow))
        base = _tex2DVecN(input, pos.x - q->inDataWindow[0], pos.y - q->inDataWindow[2], q->srcCompOrder);
    const float b[4] = {base.x, base.y, base.z, base.w}, s[4] = {sum.x, sum.y, sum.z, sum.w};
    float r[4];
    for (int c = 0; c < 4; ++c) r[c] = q->chans[c] ? b[c] + (s[c] * q->scale[c] - b[c]) * q->blend : b[c];
    _tex2DVec4Write(output, x, y, make_intensity(make_float4(r[0], r[1], r[2], r[3]), q->dstCompOrder));
}
)KROM";

} // namespace Orvane
