#pragma once
// Point reads of a float RGBA image at continuous positions, for warps that
// compute their own source position per sample (lens distortion and the
// like): bilinear or nearest, with an edge rule for positions off the data.
//
// Positions: pixel (i, j) covers [i, i + 1) x [j, j + 1), rows counted from
// the bottom; its centre (i + 0.5, j + 0.5) reads the pixel exactly.
// Bilinear takes the four pixels around the position; a tap of weight 0 is
// not read, so positions on a centre line see only the pixels on it.
//
// Edges, per tap (EdgeMode values):
//   EdgeCanvas     outside the data window: the canvas colour;
//   EdgeDuplicate  clamped into the data window (its border pixels repeat);
//   EdgeWrap       wrapped into the frame (floored remainder), then canvas
//                  outside the data window.
// A data window with no pixels reads as canvas everywhere.
//
// The sampler only keeps pointers into the image's rows: the image must
// outlive it and keep its rows. Inline, with the fast case (all taps inside
// the data window) first, so row loops over it vectorise the weights.
//
// Thread safety: reads only; any number of threads may share one sampler.
#include <algorithm>
#include <cmath>
#include <cstdint>

#include "host/image/Image.h"
#include "host/image/Pixel.h"
#include "host/image/ResizeFilters.h"

namespace Orvane {

class EdgeSampler {
public:
    /// `img` must be DepthRGBAFlt32 with rows.
    EdgeSampler(const Image &img, int edge)
        : img_(img), dw_(img.DataWindow()), width_(img.Width()), height_(img.Height()), edge_(edge),
          canvas_(img.GetCanvasColor()) {}

    int Edge() const { return edge_; }

    /// Bilinear colour at (x, y), added to `sum` times `weight`.
    void AddBilinear(double x, double y, float weight, float sum[4]) const {
        const double fx = x - 0.5, fy = y - 0.5;
        if (!(std::fabs(fx) < kFar && std::fabs(fy) < kFar)) return AddPixel(FarTap(fx), FarTap(fy), weight, sum);
        const double flx = std::floor(fx), fly = std::floor(fy);
        const int i = static_cast<int>(flx), j = static_cast<int>(fly);
        const float ax = static_cast<float>(fx - flx), ay = static_cast<float>(fy - fly);
        if (i >= dw_.x0 && i + 1 < dw_.x1 && j >= dw_.y0 && j + 1 < dw_.y1) {
            const float *r0 = Row(j) + 4 * (i - dw_.x0), *r1 = Row(j + 1) + 4 * (i - dw_.x0);
            const float w00 = (1 - ax) * (1 - ay) * weight, w10 = ax * (1 - ay) * weight;
            const float w01 = (1 - ax) * ay * weight, w11 = ax * ay * weight;
            for (int c = 0; c < 4; ++c) sum[c] += w00 * r0[c] + w10 * r0[4 + c] + w01 * r1[c] + w11 * r1[4 + c];
            return;
        }
        const float wx[2] = {1 - ax, ax}, wy[2] = {1 - ay, ay};
        for (int b = 0; b < 2; ++b)
            for (int a = 0; a < 2; ++a)
                if (wx[a] * wy[b] != 0.f) AddPixel(i + a, j + b, wx[a] * wy[b] * weight, sum);
    }

    /// The pixel under (x, y), added to `sum` times `weight`.
    void AddNearest(double x, double y, float weight, float sum[4]) const {
        if (!(std::fabs(x) < kFar && std::fabs(y) < kFar)) return AddPixel(FarTap(x), FarTap(y), weight, sum);
        AddPixel(static_cast<int>(std::floor(x)), static_cast<int>(std::floor(y)), weight, sum);
    }

    /// Pixel (i, j) under the edge rule, added to `sum` times `weight`.
    void AddPixel(int i, int j, float weight, float sum[4]) const {
        if (edge_ == EdgeDuplicate && !dw_.IsNull()) {
            i = std::clamp(i, dw_.x0, dw_.x1 - 1);
            j = std::clamp(j, dw_.y0, dw_.y1 - 1);
        } else if (edge_ == EdgeWrap && width_ > 0 && height_ > 0) {
            i = ((i % width_) + width_) % width_;
            j = ((j % height_) + height_) % height_;
        }
        if (i >= dw_.x0 && i < dw_.x1 && j >= dw_.y0 && j < dw_.y1) {
            const float *p = Row(j) + 4 * (i - dw_.x0);
            for (int c = 0; c < 4; ++c) sum[c] += weight * p[c];
        } else {
            sum[0] += weight * canvas_.R, sum[1] += weight * canvas_.G;
            sum[2] += weight * canvas_.B, sum[3] += weight * canvas_.A;
        }
    }

private:
    // Beyond this every rule gives the same tap as at this distance (frames are far smaller), and the
    // conversion to int stays defined; NaN lands here too.
    static constexpr double kFar = 1 << 28;
    static int FarTap(double v) { return v > 0 ? (1 << 28) : -(1 << 28); }
    const float *Row(int j) const { return reinterpret_cast<const float *>(img_.ScanLine(j)); }

    const Image &img_;
    ImgRectI dw_;
    int width_, height_, edge_;
    FltPixel canvas_;
};

} // namespace Orvane
