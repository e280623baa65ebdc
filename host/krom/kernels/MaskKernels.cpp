// The mask merge kernel of the common library: the paint modes of
// host/image/PaintModes.cpp, term for term and in the same float order, so
// float masks get the rows' bits. Mode numbers are those of PaintMode.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kMaskMergeKernel[] = R"KROM(
KROM_FN float mm_paint(int mode, float l, float i, float m) {
    float f;
    if (mode == 10) return i;
    if (mode == 9) return _fminf(_fmaxf(l * m, 0.f), 1.f);
    if (mode == 1) f = i + m;
    else if (mode == 2) f = i - m;
    else if (mode == 3) f = _fminf(i, m);
    else if (mode == 4) f = _fmaxf(i, m);
    else if (mode == 5) f = 0.5f * (i + m);
    else if (mode == 6) f = i * m;
    else if (mode == 7) f = m;
    else if (mode == 8) f = i + m - 2.f * i * m;
    else f = i + m - i * m;
    return _fminf(_fmaxf(i + l * (f - i), 0.f), 1.f);
}

__KERNEL__ void MaskMerge(__CONSTANTREF__ MaskMergeParams *p_pParams, __TEXTURE2D__ mask, __TEXTURE2D__ incoming,
                          __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    __CONSTANTREF__ MaskMergeParams *q = p_pParams;
    if (x >= q->workSize[0] || y >= q->workSize[1]) return;
    const int2 pos = make_int2(x + q->maskWindow[0], y + q->maskWindow[2]);
    float i = q->inCanvas;
    if (IsInsideROI(pos, q->inWindow)) i = _tex2DVecN(incoming, pos.x - q->inWindow[0], pos.y - q->inWindow[2], 0).w;
    const float m = _tex2DVecN(mask, x, y, 0).w;
    const float v = mm_paint(q->mode, q->level, i, m);
    _tex2DVec4Write(output, x, y, make_intensity(make_float4(v, v, v, v), q->dstCompOrder));
}
)KROM";

} // namespace Orvane
