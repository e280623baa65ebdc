// Image::ImageCrop (a moved, optionally subsampled copy into another image,
// converting depth) and the point samplers SamplePixelB/W/D.
#include <algorithm>
#include <cmath>
#include <cstring>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {

bool Image::ImageCrop(Image *dest, int x, int y, const TagList &tags, int xStep, int yStep) const {
    if (!dest || dest == this || xStep < 1 || yStep < 1) return false;
    dest->SetCanvasColor(canvas_);
    const ImgRectI dw = dest->DataWindow();
    if (dest->IsNoData() || dw.IsNull()) return true;
    if (!DownloadGPUMem() || !dest->AllocScanLineData()) return false;
    const auto *req = tags.GetPtrAs<const Request>(WorkRequest);
    const RenderTask *task = req ? req->GetTask() : nullptr;
    const std::atomic<bool> *abort = task ? task->AbortFlag() : nullptr;
    std::atomic<bool> failed{false};

    const bool sameDepth = depth_ == dest->depth_ && xStep == 1 && HasScanLineData();
    const size_t bpp = static_cast<size_t>(BytesPerPixel());
    // The canvas in the destination's depth, for the same-depth copy.
    std::vector<uint8_t> canvasBytes(bpp);
    StoreFlt(depth_, &canvas_, 1, canvasBytes.data());
    auto fillCanvas = [&](uint8_t *to, int count) {
        for (int i = 0; i < count; ++i) std::memcpy(to + i * bpp, canvasBytes.data(), bpp);
    };
    auto rows = [&](int j0, int j1) {
        std::vector<FltPixel> span;
        for (int j = j0; j < j1; ++j) {
            if ((abort && abort->load(std::memory_order_relaxed)) || CheckAbort() || dest->CheckAbort()) {
                failed.store(true, std::memory_order_relaxed);
                return;
            }
            const long long sy = y + static_cast<long long>(j) * yStep;
            uint8_t *out = dest->ScanLine(j);
            const long long sx0 = x + static_cast<long long>(dw.x0) * xStep;
            const long long sx1 = x + static_cast<long long>(dw.x1 - 1) * xStep + 1;
            const bool rowInside = sy >= dataWindow_.y0 && sy < dataWindow_.y1;
            if (sameDepth) {
                // Source columns [sx0, sx1) straight across; the canvas where they leave the window.
                const long long in0 = rowInside ? std::clamp<long long>(dataWindow_.x0, sx0, sx1) : sx1;
                const long long in1 = rowInside ? std::clamp<long long>(dataWindow_.x1, in0, sx1) : sx1;
                fillCanvas(out, static_cast<int>(in0 - sx0));
                if (in1 > in0)
                    std::memcpy(out + (in0 - sx0) * bpp, PixelAddress(static_cast<int>(in0), static_cast<int>(sy)),
                                (in1 - in0) * bpp);
                fillCanvas(out + (in1 - sx0) * bpp, static_cast<int>(sx1 - in1));
                continue;
            }
            span.resize(static_cast<size_t>(sx1 - sx0));
            if (!rowInside || sx1 <= dataWindow_.x0 || sx0 >= dataWindow_.x1)
                std::fill(span.begin(), span.end(), canvas_);
            else
                ReadSpanFlt(*this, static_cast<int>(sy), static_cast<int>(sx0), static_cast<int>(sx1), span.data());
            if (xStep > 1)
                for (int i = 0; i < dw.Width(); ++i) span[i] = span[static_cast<size_t>(i) * xStep];
            StoreFlt(dest->depth_, span.data(), dw.Width(), out);
        }
    };
    if (tags.GetBool(WorkThreaded, true))
        ParallelRange(dw.y0, dw.y1, rows, 8);
    else
        rows(dw.y0, dw.y1);
    return !failed.load();
}

namespace {

/// The bilinear colour at fixed-point (x, y): pixel i's centre at (i << 16) + 32768.
FltPixel Bilinear(const Image &img, int32_t x, int32_t y) {
    img.DownloadGPUMem();
    const int64_t fx = static_cast<int64_t>(x) - 32768, fy = static_cast<int64_t>(y) - 32768;
    const int i = static_cast<int>(fx >> 16), j = static_cast<int>(fy >> 16); // floor
    const double ax = static_cast<double>(fx & 0xffff) / 65536.0, ay = static_cast<double>(fy & 0xffff) / 65536.0;
    const double w[4] = {(1 - ax) * (1 - ay), ax * (1 - ay), (1 - ax) * ay, ax * ay};
    const int di[4] = {0, 1, 0, 1}, dj[4] = {0, 0, 1, 1};
    double sum[4] = {0, 0, 0, 0};
    for (int k = 0; k < 4; ++k) {
        if (w[k] == 0.0) continue; // on a centre line only the pixels on it count, whatever the others hold
        const FltPixel p = img.GetFlt(i + di[k], j + dj[k]);
        sum[0] += w[k] * p.R, sum[1] += w[k] * p.G, sum[2] += w[k] * p.B, sum[3] += w[k] * p.A;
    }
    return {static_cast<float>(sum[0]), static_cast<float>(sum[1]), static_cast<float>(sum[2]),
            static_cast<float>(sum[3])};
}

} // namespace

void Image::SamplePixelD(int32_t x, int32_t y, FltPixel &out) const { out = Bilinear(*this, x, y); }

void Image::SamplePixelW(int32_t x, int32_t y, uint16_t out[4]) const {
    const FltPixel p = Bilinear(*this, x, y);
    out[0] = FloatToU16(p.R), out[1] = FloatToU16(p.G), out[2] = FloatToU16(p.B), out[3] = FloatToU16(p.A);
}

void Image::SamplePixelB(int32_t x, int32_t y, uint8_t out[4]) const {
    const FltPixel p = Bilinear(*this, x, y);
    out[0] = FloatToU8(p.R), out[1] = FloatToU8(p.G), out[2] = FloatToU8(p.B), out[3] = FloatToU8(p.A);
}

} // namespace Orvane
