#pragma once
// The windows of a per-pixel kernel's parameter block, filled the same way by
// every tool whose output pixel depends only on the input pixel at the same
// place: `inDataWindow` (empty when the input has pixels on neither side, so
// the kernel writes the canvas colour everywhere), `outDataWindow`, both as
// x0, x1, y0, y1, and `workSize`, one work item per output pixel.
//
// Thread safety: fills the caller's block only.
#include <cstring>

#include "host/image/Image.h"

namespace Orvane {

template <class Params> void SetPointKernelWindows(Params &p, const Image &src, const Image &dst) {
    const bool hasPixels = src.HasScanLineData() || src.IsGPUMemDirty();
    const ImgRectI in = hasPixels ? src.DataWindow() : ImgRectI(), out = dst.DataWindow();
    const int inWindow[4] = {in.x0, in.x1, in.y0, in.y1}, outWindow[4] = {out.x0, out.x1, out.y0, out.y1};
    static_assert(sizeof p.inDataWindow == sizeof inWindow && sizeof p.outDataWindow == sizeof outWindow);
    std::memcpy(p.inDataWindow, inWindow, sizeof inWindow);
    std::memcpy(p.outDataWindow, outWindow, sizeof outWindow);
    p.workSize[0] = out.Width();
    p.workSize[1] = out.Height();
}

} // namespace Orvane
