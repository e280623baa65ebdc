// Image::ScaleOfImage and Image::ResizeTagList: both run the separable
// resampler of Resample.h. ScaleOfImage is its box filter at a whole shrink
// factor, where each output pixel's footprint is exactly one block; the
// source range the filters may read is the image rectangle joined with the
// data window, so blocks reaching past the frame's edge average the part
// that exists.
#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/Resample.h"

namespace Orvane {
namespace imgresize {

/// The abort flag of a request's render, or null.
const std::atomic<bool> *AbortOf(const Request *req) {
    const RenderTask *task = req ? req->GetTask() : nullptr;
    return task ? task->AbortFlag() : nullptr;
}

/// Where an image's pixels may be read: its frame joined with its data window.
ImgRectI SourceRange(const Image &img) { return img.Frame() | img.DataWindow(); }

/// A rectangle's corners divided by whole factors, rounded outward (floor for
/// the low corner, ceiling for the high one), endless sides kept.
ImgRectI DivideOutward(const ImgRectI &r, int fx, int fy) {
    if (r.IsNull()) return r;
    auto down = [](int v, int f) {
        return IsEndlessSide(v) ? v : static_cast<int>(std::floor(static_cast<double>(v) / f));
    };
    auto up = [](int v, int f) {
        return IsEndlessSide(v) ? v : static_cast<int>(std::ceil(static_cast<double>(v) / f));
    };
    return ImgRectI(down(r.x0, fx), down(r.y0, fy), up(r.x1, fx), up(r.y1, fy));
}

} // namespace imgresize

Ref<Image> Image::ScaleOfImage(Request *req, double xFactor, double yFactor) const {
    if (!(xFactor >= 1.0) || !(yFactor >= 1.0) || !std::isfinite(xFactor) || !std::isfinite(yFactor)) return nullptr;
    const int fx = static_cast<int>(std::min(std::lround(xFactor), static_cast<long>(MaxImageSide)));
    const int fy = static_cast<int>(std::min(std::lround(yFactor), static_cast<long>(MaxImageSide)));
    const int w = (width_ + fx - 1) / fx, h = (height_ + fy - 1) / fy;
    const ImgRectI dw = imgresize::DivideOutward(dataWindow_, fx, fy);
    const ImgRectI vw = imgresize::DivideOutward(validWindow_, fx, fy) & dw;
    Ref<Image> out = NewImageTagList({{ImgLikeImage, this},
                                      {ImgWidth, std::max(w, 1)},
                                      {ImgHeight, std::max(h, 1)},
                                      // The pixel aspect follows unequal factors; a uniform shrink keeps it.
                                      {ImgXScale, xScale_ * fx / std::min(fx, fy)},
                                      {ImgYScale, yScale_ * fy / std::min(fx, fy)},
                                      {ImgDataWindow, &dw},
                                      {ImgValidWindow, &vw},
                                      {ImgNoData, noData_},
                                      {ImgCanvasColor, &canvas_}});
    if (!out) return nullptr;
    out->Metadata() = metadata_;
    out->SetIsOpaque(opaque_);
    if (out->IsNoData()) return out;
    const ImgRectI range = imgresize::SourceRange(*this);
    ResampleAxis ax, ay;
    if (!ax.Build(ResampleBox, 1.0 / fx, 0.0, dw.x0, dw.Width(), range.x0, range.x1) ||
        !ay.Build(ResampleBox, 1.0 / fy, 0.0, dw.y0, dw.Height(), range.y0, range.y1))
        return nullptr;
    if (!ResampleImage(*this, *out, ax, ay, imgresize::AbortOf(req))) return nullptr;
    return out;
}

bool Image::ResizeTagList(Image *dest, const TagList &tags) const {
    if (!dest || dest == this || width_ < 1 || height_ < 1) return false;
    const int filter = static_cast<int>(
        std::clamp<long long>(tags.GetLong(ResizeFilter, ResampleBilinear), ResampleNearest, ResampleBicubic));
    const auto *req = tags.GetPtrAs<const Request>(WorkRequest);
    const ImgRectI dw = dest->DataWindow();
    if (dest->IsNoData() || dw.IsNull()) {
        dest->SetCanvasColor(canvas_);
        return true;
    }
    const double sx = static_cast<double>(dest->Width()) / width_, sy = static_cast<double>(dest->Height()) / height_;
    const ImgRectI range = imgresize::SourceRange(*this);
    ResampleAxis ax, ay;
    if (!ax.Build(filter, sx, 0.0, dw.x0, dw.Width(), range.x0, range.x1) ||
        !ay.Build(filter, sy, 0.0, dw.y0, dw.Height(), range.y0, range.y1))
        return false;
    return ResampleImage(*this, *dest, ax, ay, imgresize::AbortOf(req));
}

} // namespace Orvane
