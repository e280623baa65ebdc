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
#include <type_traits>

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

/// Reads x0..x1-1 of row y of `img` as values over 0..1: its pixels inside
/// its data window, its canvas colour elsewhere; an absent image (null) reads
/// as 0.
template <class T> void ReadUnitSpan(const Image *img, int y, int x0, int x1, T (*px)[4]) {
    const FltPixel canvas = img ? img->GetCanvasColor() : FltPixel{};
    const ImgRectI dw = img && img->HasScanLineData() ? img->DataWindow() : ImgRectI();
    const bool rowIn = y >= dw.y0 && y < dw.y1;
    const int left = rowIn ? std::clamp(dw.x0, x0, x1) : x1, right = rowIn ? std::clamp(dw.x1, left, x1) : x1;
    for (int x = x0; x < x1; ++x)
        if (x < left || x >= right)
            px[x - x0][0] = canvas.R, px[x - x0][1] = canvas.G, px[x - x0][2] = canvas.B, px[x - x0][3] = canvas.A;
    if (right > left) LoadUnits(img->Depth(), img->PixelAddress(left, y), right - left, px + (left - x0));
}

/// The step (0..top) a value over 0..1 lands on at an integer depth whose
/// largest value is `top`: the nearest one, or with a dither number d in
/// [0, 1) the one below v * top + d. Values within `snap` (relative) of a
/// step stay on it: a step of another depth that went through float comes
/// back a rounding away from where it was. NaN gives 0.
inline double StepOf(double v, double top, double d = -1.0, double snap = 0x1p-23) {
    const double s = std::clamp(v * top, 0.0, top);
    if (!(s > 0.0)) return 0.0;
    const double nearest = std::floor(s + 0.5);
    return d < 0.0 || std::fabs(s - nearest) <= s * snap ? nearest : std::floor(s + d);
}

/// Writes n pixels of values over 0..1 at `depth`. `dither` (integer depths
/// only) gives for pixel k and channel c a number in [0, 1) added before the
/// value is cut down to its step, in place of rounding to nearest; `snap` as
/// in StepOf.
template <class T, class Dither>
void StoreUnits(int depth, const T (*px)[4], int n, uint8_t *dst, const Dither &dither, double snap = 0x1p-23) {
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
            for (int c = 0; c < 4; ++c)
                v[c] = static_cast<uint16_t>(StepOf(static_cast<double>(px[i + k][c]), top, dither(i + k, c), snap) *
                                             (eight ? 257.0 : 1.0));
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
            if constexpr (std::is_invocable_v<const Fn &, T(*)[4], int>)
                fn(px, m); // the function takes a block at once
            else
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
