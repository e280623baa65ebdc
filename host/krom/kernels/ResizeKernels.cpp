// Resize kernels of the common library: the two passes of the host's
// separable resampler (Resample.h). "ResizeAcross" filters every source row
// the output needs along x into a float image; "ResizeDown" filters that
// along y into the output. The coefficient tables arrive as one-channel float
// images, one row per output sample: the first source index, then the
// weights. The sums run in the rows' order (across: even and odd taps apart,
// added last; down: taps in order), so a float output gets the rows' bits.
#include "host/krom/kernels/KernelTexts.h"

namespace Orvane {

const char kResizeKernels[] = R"KROM(
/// MapEdge of ResizeFilters.h: an index beyond [lo, hi) under an edge policy
/// (1 wrap, 2 duplicate, 3 mirror; -1 never leaves the range); lo - 1 where
/// the canvas colour lies.
KROM_FN int rsz_map(int i, int lo, int hi, int edges) {
    if (edges < 0 || (i >= lo && i < hi)) return i;
    const int n = hi - lo;
    if (n <= 0) return lo - 1;
    if (edges == 1) {
        int k = (i - lo) % n;
        if (k < 0) k += n;
        return lo + k;
    }
    if (edges == 2) return i < lo ? lo : hi - 1;
    if (edges == 3) {
        const int period = 2 * n;
        int k = (i - lo) % period;
        if (k < 0) k += period;
        return lo + (k < n ? k : period - 1 - k);
    }
    return lo - 1;
}

/// What the rows read at source position (x, y) before the edge policies.
KROM_FN float4 rsz_source(__CONSTANTREF__ ResizeParams *q, __TEXTURE2D__ input, int x, int y) {
    const int mx = rsz_map(x, q->rangeX[0], q->rangeX[1], q->edges[0]);
    const int my = rsz_map(y, q->rangeY[0], q->rangeY[1], q->edges[1]);
    const int2 pos = make_int2(mx, my);
    if (mx < q->rangeX[0] || my < q->rangeY[0] || !IsInsideROI(pos, q->srcWindow)) return to_float4_v(q->canvas);
    return _tex2DVecN(input, mx - q->srcWindow[0], my - q->srcWindow[2], q->srcCompOrder);
}

__KERNEL__ void ResizeAcross(__CONSTANTREF__ ResizeParams *p_pParams, __TEXTURE2D__ input, __TEXTURE2D__ tableX,
                             __TEXTURE2D_WRITE__ across) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->acrossSize[0] || y >= p_pParams->acrossSize[1]) return;
    const int first = (int)_tex2DVecN(tableX, 0, x, 8).w;
    const int sy = y + p_pParams->rowsY0;
    float4 even = make_float4(0.f, 0.f, 0.f, 0.f), odd = make_float4(0.f, 0.f, 0.f, 0.f);
    for (int k = 0; k < p_pParams->tapsX; k += 2) {
        const float w0 = _tex2DVecN(tableX, 1 + k, x, 8).w, w1 = _tex2DVecN(tableX, 2 + k, x, 8).w;
        even = even + w0 * rsz_source(p_pParams, input, first + k, sy);
        odd = odd + w1 * rsz_source(p_pParams, input, first + k + 1, sy);
    }
    _tex2DVec4Write(across, x, y, even + odd);
}

__KERNEL__ void ResizeDown(__CONSTANTREF__ ResizeParams *p_pParams, __TEXTURE2D__ across, __TEXTURE2D__ tableY,
                           __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    const int first = (int)_tex2DVecN(tableY, 0, y, 8).w - p_pParams->rowsY0;
    float4 acc = make_float4(0.f, 0.f, 0.f, 0.f);
    for (int k = 0; k < p_pParams->tapsY; ++k)
        acc = acc + _tex2DVecN(tableY, 1 + k, y, 8).w * _tex2DVecN(across, x, first + k, 15);
    _tex2DVec4Write(output, x, y, make_intensity(acc, p_pParams->dstCompOrder));
}
)KROM";

} // namespace Orvane
