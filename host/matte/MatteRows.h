#pragma once
// The row walk the matte steps share (MatteSteps.h): an image's data window
// changed in place, row by row on the worker pool, each row seen as pixels of
// one of two kinds:
//
//   FltPixel  float images (float16, float32): values as they are, white 1
//   Pixel     integer images (int8, int16): 16-bit values, white 65535; int8
//             is widened on loading and rounded back once on storing
//
// A step writes its formula once, as a span function templated on the pixel
// kind, reading channels with Val, writing them with Put (integers round and
// clamp) and scaling constants by kOne<P>. The same function run on the
// canvas colour (a FltPixel) gives the canvas's result.
//
// Internal to host/matte. Thread safety: Walk runs the span function on
// several workers at once, each on rows of its own.
#include <algorithm>
#include <atomic>
#include <type_traits>
#include <vector>

#include "host/core/Parallel.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {

class Request;

namespace matterows {

/// The value white has in a pixel kind.
template <class P> constexpr float kOne = std::is_same_v<P, Pixel> ? 65535.f : 1.f;

inline float Val(float v) { return v; }
inline float Val(uint16_t v) { return static_cast<float>(v); }
inline void Put(float &to, float v) { to = v; }
inline void Put(uint16_t &to, float v) {
    to = v > 0.f ? (v < 65535.f ? static_cast<uint16_t>(v + 0.5f) : uint16_t{65535}) : uint16_t{0}; // NaN: 0
}

/// Channel c (0 R, 1 G, 2 B, 3 A) of a pixel kind, as a member pointer.
template <class P> auto ChannelOf(int c) {
    static constexpr decltype(&P::R) members[4] = {&P::R, &P::G, &P::B, &P::A};
    return members[std::clamp(c, 0, 3)];
}

/// The channel a step on `channel` changes: a one-channel image has only alpha.
inline int StoredChannel(const Image &img, int channel) { return img.IsMask() ? 3 : channel; }

/// True when the render behind `req` or the image's own flag says stop.
bool Aborted(const Request *req, const Image &img);

/// Readies `img` for changing its rows: pixels in main memory, rows made
/// (zeroed when it had none) and a device copy dropped, as it would go
/// stale. False when the download failed or memory was refused.
bool PrepareRows(Image &img);

/// Sets the canvas colour to a step's result on it; a one-channel image keeps
/// its one value (alpha) in all four places.
void SetCanvasResult(Image &img, const FltPixel &result);

/// Buffers one worker keeps while walking rows.
struct RowScratch {
    std::vector<FltPixel> flt, aux;
    std::vector<Pixel> pix;
    std::vector<float> values;
};

/// Row y of `img` as pixels of kind P: the row itself where it stores P
/// (RGBA float32, RGBA int16), else loaded into `s`.
template <class P> P *LoadRow(const Image &img, int y, RowScratch &s) {
    uint8_t *row = img.ScanLine(y);
    const int n = img.DataWindow().Width();
    if constexpr (std::is_same_v<P, FltPixel>) {
        if (img.Depth() == DepthRGBAFlt32) return reinterpret_cast<FltPixel *>(row);
        s.flt.resize(n);
        LoadFlt(img.Depth(), row, n, s.flt.data());
        return s.flt.data();
    } else {
        if (img.Depth() == DepthRGBAInt16) return reinterpret_cast<Pixel *>(row);
        s.pix.resize(n);
        LoadPixel(img.Depth(), row, n, s.pix.data());
        return s.pix.data();
    }
}

/// Stores a row LoadRow gave back (nothing to do when it was the row itself).
template <class P> void StoreRow(Image &img, int y, const P *px) {
    uint8_t *row = img.ScanLine(y);
    if (reinterpret_cast<const uint8_t *>(px) == row) return;
    if constexpr (std::is_same_v<P, FltPixel>)
        StoreFlt(img.Depth(), px, img.DataWindow().Width(), row);
    else
        StorePixel(img.Depth(), px, img.DataWindow().Width(), row);
}

/// Calls row(y, scratch) for every row of `img`'s data window on the worker
/// pool, polling the abort before each row. False when abandoned: rows not
/// reached are left alone.
template <class RowFn> bool ForEachRow(const Request *req, const Image &img, const RowFn &row) {
    const ImgRectI dw = img.DataWindow();
    std::atomic<bool> stopped{false};
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            RowScratch scratch;
            for (int y = y0; y < y1; ++y) {
                if (stopped.load(std::memory_order_relaxed) || Aborted(req, img)) {
                    stopped = true;
                    return;
                }
                row(y, scratch);
            }
        },
        4);
    return !stopped;
}

/// Runs span(px, n, y, x0, scratch) over every row of `img` in place, px
/// being FltPixel * for float images and Pixel * for integer ones. False
/// when the rows could not be readied or the walk was abandoned.
template <class Span> bool Walk(const Request *req, Image &img, const Span &span) {
    if (!PrepareRows(img)) return false;
    const ImgRectI dw = img.DataWindow();
    if (img.IsNoData() || dw.IsNull()) return true;
    auto walk = [&](auto kind) {
        using P = decltype(kind);
        return ForEachRow(req, img, [&](int y, RowScratch &s) {
            P *px = LoadRow<P>(img, y, s);
            span(px, dw.Width(), y, dw.x0, s);
            StoreRow<P>(img, y, px);
        });
    };
    return img.IsFloat() ? walk(FltPixel{}) : walk(Pixel{});
}

/// A step made of span(px, n) alone: run on every row and on the canvas.
template <class Span> bool PointStep(const Request *req, Image &img, const Span &span) {
    if (!Walk(req, img, [&](auto *px, int n, int, int, RowScratch &) { span(px, n); })) return false;
    FltPixel canvas = img.GetCanvasColor();
    span(&canvas, 1);
    SetCanvasResult(img, canvas);
    return true;
}

/// A step guided by a second image: apply(pixel, v) on every pixel and on
/// the canvas, v being `by`'s alpha (or one channel) at the same place, its
/// canvas beyond its window. `by` must have its pixels in main memory.
template <class Apply> bool StepBy(const Request *req, Image &img, const Image &by, const Apply &apply) {
    const bool ok = Walk(req, img, [&](auto *px, int n, int y, int x0, RowScratch &s) {
        s.aux.resize(n);
        ReadSpanFlt(by, y, x0, x0 + n, s.aux.data());
        for (int i = 0; i < n; ++i) apply(px[i], s.aux[i].A);
    });
    if (!ok) return false;
    FltPixel canvas = img.GetCanvasColor();
    apply(canvas, by.GetCanvasColor().A);
    SetCanvasResult(img, canvas);
    return true;
}

} // namespace matterows
} // namespace Orvane
