#pragma once
// The frame of a tool whose output pixel depends only on the input pixel at
// the same place (the colour tools):
//
//  * NewPointOutput: the output image, like the input, over the data window
//    the clipping mode gives (ToolFrame.h), valid over the request's region;
//    without pixels in pre-calculation.
//  * PointRows: the walk of one output row in its three spans (SplitRow): the
//    middle through the tool's span function, reading the input's pixels; the
//    spans beyond the input's window filled with one pixel, the canvas colour
//    already passed through the tool's function once in Process.
//
// A tool runs the rows on its workers with
//     const PointRows rows(*src, *dst, canvasPixel);
//     DoMultiProcess([&](int i) { rows.Row(i, span); }, rows.Count());
// where span(const uint8_t *in, uint8_t *out, int count) maps `count` stored
// pixels in the image's depth (in and out may be the same memory).
//
// Thread safety: NewPointOutput on the render thread; Row from any number of
// workers at once, each writing only its own row.
#include <cstdint>
#include <cstring>

#include "host/core/OvID.h"
#include "host/flow/ToolFrame.h"
#include "host/image/Image.h"

namespace Orvane {

class Input;
class Request;

/// The output of a per-pixel tool for `src`; null when out of memory.
ORVANE_API Ref<Image> NewPointOutput(Request *req, const Input *in, const Image *src, OvID clippingMode);

class PointRows {
public:
    /// Rows of `dst`'s data window over `src`'s pixels; `canvasPixel` is one
    /// pixel in `dst`'s depth. `dst` must have its scan lines.
    PointRows(const Image &src, Image &dst, const void *canvasPixel)
        : src_(src), dst_(dst), in_(src.HasScanLineData() ? src.DataWindow() : ImgRectI()), out_(dst.DataWindow()),
          bpp_(dst.BytesPerPixel()) {
        std::memcpy(canvas_, canvasPixel, static_cast<size_t>(bpp_));
    }

    /// Rows to walk: one chunk each.
    int Count() const { return out_.Height(); }

    /// Row `chunk` of the output window (0 is its first row).
    template <class Span> void Row(int chunk, const Span &span) const {
        if (dst_.CheckAbort()) return;
        const int y = out_.y0 + chunk;
        uint8_t *row = dst_.ScanLine(y);
        if (!row) return;
        const RowSpans s = SplitRow(out_, in_, y);
        Fill(row, s.midStart - s.x0);
        if (s.hasInput) span(src_.PixelAddress(s.midStart, y), row + Offset(s.midStart - s.x0), s.midEnd - s.midStart);
        Fill(row + Offset(s.midEnd - s.x0), s.x1 - s.midEnd);
    }

private:
    size_t Offset(int pixels) const { return static_cast<size_t>(pixels) * static_cast<size_t>(bpp_); }
    void Fill(uint8_t *at, int count) const {
        for (int i = 0; i < count; ++i) std::memcpy(at + Offset(i), canvas_, static_cast<size_t>(bpp_));
    }

    const Image &src_;
    Image &dst_;
    ImgRectI in_, out_;
    int bpp_;
    uint8_t canvas_[16] = {};
};

} // namespace Orvane
