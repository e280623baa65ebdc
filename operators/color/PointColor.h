#pragma once
// What the small colour tools share: a colour function of one pixel, run over
// every depth, over the canvas colour and over the rows of PointRows.
//
// A colour function is a callable taking one pixel as `T p[4]` (red, green,
// blue, alpha, premultiplied) and changing it in place, for T float and
// double. Float depths work in float on the stored values; integer depths in
// double on the values over 0..1 (a stored value over 255 or 65535), and each
// result is rounded once to the depth's own steps: 8-bit values to the nearest
// 1/255, not through 16 bits. So a function that is exact in double is exact
// at every depth. Single-channel (mask) data reads into all four channels and
// writes from alpha, as PixelConvert.h does.
//
// Thread safety: pure functions; RunPointColor runs the rows on the tool's
// workers, each writing its own row.
#include <algorithm>
#include <cmath>
#include <cstdint>

#include "host/core/Tags.h"
#include "host/flow/Operator.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {

/// Pixels converted at a time.
constexpr int kPointBlock = 256;

/// Reads n stored pixels of `depth` as values over 0..1 (see above).
template <class T> void LoadUnits(int depth, const uint8_t *src, int n, T (*px)[4]) {
    if (FormatOfDepth(depth).isFloat) {
        FltPixel f[kPointBlock];
        for (int i = 0; i < n; i += kPointBlock) {
            const int m = std::min(kPointBlock, n - i);
            LoadFlt(depth, src + static_cast<size_t>(i) * FormatOfDepth(depth).BytesPerPixel(), m, f);
            for (int k = 0; k < m; ++k)
                px[i + k][0] = f[k].R, px[i + k][1] = f[k].G, px[i + k][2] = f[k].B, px[i + k][3] = f[k].A;
        }
        return;
    }
    Pixel p[kPointBlock];
    for (int i = 0; i < n; i += kPointBlock) {
        const int m = std::min(kPointBlock, n - i);
        LoadPixel(depth, src + static_cast<size_t>(i) * FormatOfDepth(depth).BytesPerPixel(), m, p);
        for (int k = 0; k < m; ++k) {
            const uint16_t v[4] = {p[k].R, p[k].G, p[k].B, p[k].A};
            for (int c = 0; c < 4; ++c) px[i + k][c] = static_cast<T>(v[c] / 65535.0);
        }
    }
}

/// The stored 16-bit form of a value over 0..1 at an integer depth: the
/// nearest step of that depth, clamped (8-bit steps widened by 257).
inline uint16_t UnitToStep(double v, bool eightBit) {
    const double top = eightBit ? 255.0 : 65535.0;
    const double s = std::floor(std::clamp(v * top, 0.0, top) + 0.5); // NaN clamps to 0 below
    return static_cast<uint16_t>((s > 0.0 ? s : 0.0) * (eightBit ? 257.0 : 1.0));
}

/// Writes n pixels of values over 0..1 at `depth`. `dither` (integer depths
/// only) gives for pixel k and channel c a number in [0, 1) added before the
/// value is cut down to its step, in place of rounding to nearest.
template <class T, class Dither>
void StoreUnits(int depth, const T (*px)[4], int n, uint8_t *dst, const Dither &dither) {
    const PixelFormat f = FormatOfDepth(depth);
    const size_t bpp = static_cast<size_t>(f.BytesPerPixel());
    if (f.isFloat) {
        FltPixel out[kPointBlock];
        for (int i = 0; i < n; i += kPointBlock) {
            const int m = std::min(kPointBlock, n - i);
            for (int k = 0; k < m; ++k)
                out[k] = {static_cast<float>(px[i + k][0]), static_cast<float>(px[i + k][1]),
                          static_cast<float>(px[i + k][2]), static_cast<float>(px[i + k][3])};
            StoreFlt(depth, out, m, dst + static_cast<size_t>(i) * bpp);
        }
        return;
    }
    const bool eight = f.bytesPerComponent == 1;
    const double top = eight ? 255.0 : 65535.0;
    Pixel out[kPointBlock];
    for (int i = 0; i < n; i += kPointBlock) {
        const int m = std::min(kPointBlock, n - i);
        for (int k = 0; k < m; ++k) {
            uint16_t v[4];
            for (int c = 0; c < 4; ++c) {
                const double d = dither(i + k, c);
                v[c] = d < 0.0 ? UnitToStep(static_cast<double>(px[i + k][c]), eight)
                               : UnitToStep((std::floor(static_cast<double>(px[i + k][c]) * top + d)) / top, eight);
            }
            out[k] = {v[0], v[1], v[2], v[3]};
        }
        StorePixel(depth, out, m, dst + static_cast<size_t>(i) * bpp);
    }
}

/// No dither: every value rounds to its nearest step.
struct NoDither {
    double operator()(int, int) const { return -1.0; }
};

/// Calls body(T{}) with T the unit type of `depth`: float for float depths,
/// double for integer ones.
template <class Body> void WithUnit(int depth, const Body &body) {
    if (FormatOfDepth(depth).isFloat)
        body(0.f);
    else
        body(0.0);
}

/// Maps n stored pixels through `fn` (in and out may be the same memory).
template <class Fn> void MapPointSpan(int depth, const Fn &fn, const uint8_t *in, uint8_t *out, int n) {
    WithUnit(depth, [&](auto zero) {
        using T = decltype(zero);
        T px[kPointBlock][4];
        const size_t bpp = static_cast<size_t>(FormatOfDepth(depth).BytesPerPixel());
        for (int i = 0; i < n; i += kPointBlock) {
            const int m = std::min(kPointBlock, n - i);
            LoadUnits(depth, in + i * bpp, m, px);
            for (int k = 0; k < m; ++k) fn(px[k]);
            StoreUnits(depth, px, m, out + i * bpp, NoDither{});
        }
    });
}

/// The colour `fn` makes of `canvas`, computed in the unit type of `depth`,
/// and its stored form at that depth in `stored` (16 bytes).
template <class Fn> FltPixel MapCanvas(int depth, const Fn &fn, const FltPixel &canvas, uint8_t *stored) {
    FltPixel result;
    WithUnit(depth, [&](auto zero) {
        using T = decltype(zero);
        T p[1][4] = {{canvas.R, canvas.G, canvas.B, canvas.A}};
        fn(p[0]);
        result = {static_cast<float>(p[0][0]), static_cast<float>(p[0][1]), static_cast<float>(p[0][2]),
                  static_cast<float>(p[0][3])};
        StoreUnits(depth, p, 1, stored, NoDither{});
    });
    return result;
}

/// The frame of a one-input colour tool: the output by the clipping mode, the
/// canvas colour through `fn`, the rows through `fn`. Beyond the window the
/// output keeps the input's canvas when a clipping mode is set (the frame or
/// domain then bounds what the tool made). Null when out of memory.
template <class Fn>
Ref<Image> RunPointColor(ThreadedOperator &op, Request *req, const Input *in, Image *src, const Fn &fn) {
    const OvID clipping = op.GetClippingMode(req);
    Ref<Image> dst = NewPointOutput(req, in, src, clipping);
    if (!dst) return dst;
    const int depth = src->Depth();
    uint8_t canvasPixel[16];
    dst->SetCanvasColor(MapCanvas(depth, fn, src->GetCanvasColor(), canvasPixel));
    if (!req->IsPreCalc() && !dst->ValidWindow().IsNull()) {
        if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return Ref<Image>();
        const PointRows rows(*src, *dst, canvasPixel);
        op.DoMultiProcess(
            [&](int i) { rows.Row(i, [&](const uint8_t *a, uint8_t *b, int n) { MapPointSpan(depth, fn, a, b, n); }); },
            rows.Count());
    }
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
    return dst;
}

} // namespace Orvane
