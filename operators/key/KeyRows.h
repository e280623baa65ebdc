#pragma once
// The rows of a keyer's first matte: the output's data window walked row by
// row on the tool's workers, each row split at the source's data window
// (SplitRow). Pixels are handled in blocks, as FltPixel on float images and
// as 16-bit Pixel on integer ones (8-bit values widened, rounded back once).
//
// A span function span(in, out, x, y, n) keys n pixels from (x, y): `in`
// holds the source's pixels there, or is null beyond the source's window,
// where the source is its canvas colour; `out` receives the results. Keyers
// whose result depends on the pixel alone use PointKeySpan, which fills such
// spans with the canvas colour's result, worked out once per render.
//
// Thread safety: RunKeyRows from the render thread; spans run on the workers,
// each writing its own rows.
#include <algorithm>
#include <cstdint>

#include "host/flow/Operator.h"
#include "host/flow/ToolFrame.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/krom/PointKernel.h"

namespace Orvane {

/// Pixels loaded and keyed at a time.
constexpr int kKeyBlock = 256;

inline void LoadKeyPixels(int depth, const uint8_t *src, int n, FltPixel *px) { LoadFlt(depth, src, n, px); }
inline void LoadKeyPixels(int depth, const uint8_t *src, int n, Pixel *px) { LoadPixel(depth, src, n, px); }
inline void StoreKeyPixels(int depth, const FltPixel *px, int n, uint8_t *dst) { StoreFlt(depth, px, n, dst); }
inline void StoreKeyPixels(int depth, const Pixel *px, int n, uint8_t *dst) { StorePixel(depth, px, n, dst); }

/// The canvas colour as the pixel type.
inline void CanvasKeyPixel(const Image &img, FltPixel &px) { px = img.GetCanvasColor(); }
inline void CanvasKeyPixel(const Image &img, Pixel &px) { img.GetCanvasColor(px); }

/// Keys `dst`'s data window from `src` (see above). `dst` must have its rows
/// and `src` its pixels in main memory.
template <class Px, class Span> void RunKeyRows(ThreadedOperator &op, const Image &src, Image &dst, const Span &span) {
    const ImgRectI in = src.HasScanLineData() ? src.DataWindow() : ImgRectI(), out = dst.DataWindow();
    const int srcDepth = src.Depth(), dstDepth = dst.Depth();
    const size_t dstBpp = static_cast<size_t>(dst.BytesPerPixel());
    op.DoMultiProcessRange(
        [&](int y0, int y1) {
            Px a[kKeyBlock], b[kKeyBlock];
            for (int y = y0; y < y1 && !dst.CheckAbort(); ++y) {
                uint8_t *row = dst.ScanLine(y);
                const RowSpans s = SplitRow(out, in, y);
                auto run = [&](int x0, int x1, bool canvas) {
                    for (int x = x0; x < x1; x += kKeyBlock) {
                        const int n = std::min(kKeyBlock, x1 - x);
                        if (!canvas) LoadKeyPixels(srcDepth, src.PixelAddress(x, y), n, a);
                        span(canvas ? nullptr : static_cast<const Px *>(a), b, x, y, n);
                        StoreKeyPixels(dstDepth, b, n, row + static_cast<size_t>(x - out.x0) * dstBpp);
                    }
                };
                run(s.x0, s.midStart, true);
                if (s.hasInput) run(s.midStart, s.midEnd, false);
                run(s.midEnd, s.x1, true);
            }
        },
        out.y0, out.y1);
}

/// The span of a keyer whose result depends on the pixel alone:
/// key(in, out, n) over the source's pixels, `canvasResult` beyond them.
template <class Px, class Key> struct PointKeySpan {
    const Key &key;
    Px canvasResult;
    void operator()(const Px *in, Px *out, int, int, int n) const {
        if (in)
            key(in, out, n);
        else
            std::fill(out, out + n, canvasResult);
    }
};

/// Runs a point keyer at `src`'s depth: keyFlt(in, out, n) on float images,
/// key16(in, out, n) on integer ones; the canvas colour goes through once and
/// becomes `dst`'s, the matte beyond its window.
template <class KeyFlt, class Key16>
void RunPointKeyRows(ThreadedOperator &op, const Image &src, Image &dst, const KeyFlt &keyFlt, const Key16 &key16) {
    if (src.IsFloat()) {
        FltPixel canvas;
        CanvasKeyPixel(src, canvas);
        keyFlt(&canvas, &canvas, 1);
        dst.SetCanvasColor(canvas);
        RunKeyRows<FltPixel>(op, src, dst, PointKeySpan<FltPixel, KeyFlt>{keyFlt, canvas});
    } else {
        Pixel canvas;
        CanvasKeyPixel(src, canvas);
        key16(&canvas, &canvas, 1);
        dst.SetCanvasColor(canvas);
        RunKeyRows<Pixel>(op, src, dst, PointKeySpan<Pixel, Key16>{key16, canvas});
    }
}

/// The windows of a keyer's kernel, worked out as every point kernel's
/// (SetPointKernelWindows) and copied into the keyer's own block.
struct KeyKernelWindows {
    int inDataWindow[4], outDataWindow[4], workSize[2];
    KeyKernelWindows(const Image &src, const Image &dst) { SetPointKernelWindows(*this, src, dst); }
};

} // namespace Orvane
