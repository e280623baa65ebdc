#include "host/image/Image.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <new>
#include <vector>

#include "host/core/Parallel.h"
#include "host/flow/DataTypes.h"
#include "host/image/PixelConvert.h"
#include "host/image/PixelMemory.h"
#include "host/krom/GPUMemory.h"

namespace Orvane {

Image::Image(int width, int height, int depth)
    : width_(std::max(width, 0)), height_(std::max(height, 0)), depth_(IsValidDepth(depth) ? depth : DepthRGBAFlt32),
      format_(FormatOfDepth(depth_)), dataWindow_(0, 0, width_, height_), validWindow_(dataWindow_) {}

Image::~Image() = default;

void PixelBlockDeleter::operator()(uint8_t *block) const { FreePixels(block, bytes); }

void Image::SetDataWindow(const ImgRectI &r) {
    if (HasScanLineData()) return;
    dataWindow_ = r.IsNull() ? ImgRectI() : r;
    validWindow_ &= dataWindow_;
}

void Image::GetCanvasColor(Pixel &p) const { p = FltToPixel(canvas_); }
void Image::SetCanvasColor(const Pixel &p) { canvas_ = PixelToFlt(p); }

float Image::GetCanvasColorFltChan(int channel) const {
    const float v[4] = {canvas_.R, canvas_.G, canvas_.B, canvas_.A};
    return channel >= 0 && channel < 4 ? v[channel] : 0.f;
}

void Image::SetCanvasColorFltChan(int channel, float v) {
    if (IsMask()) {
        if (channel == 3) canvas_ = FltPixel{v, v, v, v};
        return;
    }
    float *c[4] = {&canvas_.R, &canvas_.G, &canvas_.B, &canvas_.A};
    if (channel >= 0 && channel < 4) *c[channel] = v;
}

void Image::NameRefusal() const {
    NamePixelRefusal("a " + DescribeImage(dataWindow_.Width(), dataWindow_.Height(), depth_));
}

bool Image::AllocAuxPlane(AuxPlane &plane) {
    const size_t bytes = sizeof(float) * static_cast<size_t>(dataWindow_.Width()) * dataWindow_.Height();
    plane.data = std::unique_ptr<uint8_t, PixelBlockDeleter>(AllocPixels(bytes), PixelBlockDeleter{bytes});
    if (!plane.data) NameRefusal();
    return plane.data != nullptr;
}

bool Image::AllocScanLineData() {
    if (HasScanLineData()) return true;
    if (noData_) return false;
    const int h = dataWindow_.Height();
    if (dataWindow_.IsNull()) return true;
    const size_t rowBytes = RowBytes();
    const size_t total = rowBytes * static_cast<size_t>(h);
    pixels_ = std::unique_ptr<uint8_t, PixelBlockDeleter>(AllocPixels(total), PixelBlockDeleter{total});
    if (!pixels_) {
        NameRefusal();
        return false;
    }
    for (AuxPlane &plane : aux_)
        if (!plane.data && !AllocAuxPlane(plane)) {
            pixels_.reset();
            return false;
        }
    try {
        rows_.resize(h);
    } catch (const std::bad_alloc &) {
        pixels_.reset();
        return false;
    }
    for (int i = 0; i < h; ++i) rows_[i] = pixels_.get() + rowBytes * i;
    return true;
}

uint8_t *Image::PixelAddress(int x, int y) const {
    if (x < dataWindow_.x0 || x >= dataWindow_.x1) return nullptr;
    uint8_t *row = ScanLine(y);
    return row ? row + static_cast<size_t>(x - dataWindow_.x0) * BytesPerPixel() : nullptr;
}

size_t Image::DataBytes() const {
    if (!HasScanLineData()) return 0;
    return RowBytes() * dataWindow_.Height() +
           aux_.size() * sizeof(float) * dataWindow_.Width() * static_cast<size_t>(dataWindow_.Height());
}

bool Image::AddAuxChannel(AuxChannelKind kind) {
    if (HasAuxChannel(kind)) return true;
    AuxPlane plane{kind, nullptr};
    if (HasScanLineData() && !dataWindow_.IsNull() && !AllocAuxPlane(plane)) return false;
    aux_.push_back(std::move(plane));
    return true;
}

bool Image::HasAuxChannel(AuxChannelKind kind) const {
    return std::any_of(aux_.begin(), aux_.end(), [kind](const AuxPlane &p) { return p.kind == kind; });
}

float *Image::AuxRow(AuxChannelKind kind, int y) const {
    if (y < dataWindow_.y0 || y >= dataWindow_.y1) return nullptr;
    for (const AuxPlane &p : aux_)
        if (p.kind == kind && p.data) return p.Floats() + static_cast<size_t>(y - dataWindow_.y0) * dataWindow_.Width();
    return nullptr;
}

FltPixel Image::GetFlt(int x, int y) const {
    const uint8_t *p = PixelAddress(x, y);
    if (!p) return canvas_;
    FltPixel f;
    LoadFlt(depth_, p, 1, &f);
    return f;
}

void Image::PutFlt(int x, int y, const FltPixel &f) {
    if (uint8_t *p = PixelAddress(x, y)) StoreFlt(depth_, &f, 1, p);
}

void Image::Fill(const FltPixel &color) { FillWithin(color, dataWindow_); }

void Image::FillWithin(const FltPixel &color, const ImgRectI &within) {
    const ImgRectI r = within & dataWindow_;
    if (r.IsNull() || !AllocScanLineData()) return;
    // One row in the image's own format, copied into every row.
    std::vector<uint8_t> pattern(static_cast<size_t>(r.Width()) * BytesPerPixel());
    std::vector<FltPixel> colors(r.Width(), color);
    StoreFlt(depth_, colors.data(), r.Width(), pattern.data());
    ParallelRange(
        r.y0, r.y1,
        [&](int y0, int y1) {
            for (int y = y0; y < y1; ++y) std::memcpy(PixelAddress(r.x0, y), pattern.data(), pattern.size());
        },
        16);
}

void Image::Clear() {
    canvas_ = FltPixel{};
    if (!AllocScanLineData() || !pixels_) return;
    std::memset(pixels_.get(), 0, RowBytes() * dataWindow_.Height());
    const size_t planeFloats = static_cast<size_t>(dataWindow_.Width()) * dataWindow_.Height();
    for (AuxPlane &plane : aux_)
        if (plane.data) std::memset(plane.Floats(), 0, planeFloats * sizeof(float));
}

void Image::ImageCopy(const Image *src) {
    if (!src || src == this || !src->DownloadGPUMem() || !AllocScanLineData()) return;
    const ImgRectI dw = dataWindow_;
    const bool sameDepth = src->depth_ == depth_;
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            std::vector<FltPixel> span(dw.Width());
            for (int y = y0; y < y1; ++y) {
                const ImgRectI inside = ImgRectI(dw.x0, y, dw.x1, y + 1) & src->dataWindow_;
                if (sameDepth && inside.Width() == dw.Width() && src->HasScanLineData()) {
                    std::memcpy(ScanLine(y), src->PixelAddress(dw.x0, y), RowBytes());
                    continue;
                }
                ReadSpanFlt(*src, y, dw.x0, dw.x1, span.data());
                StoreFlt(depth_, span.data(), dw.Width(), ScanLine(y));
            }
        },
        8);
}

OvID Image::DataType() const { return IsMask() ? CLSID_DataType_Mask : CLSID_DataType_Image; }

uint64_t Image::Hash() const { return HashBytes(this, sizeof(void *)); }

Ref<Parameter> Image::Copy() const { return CopyOfImage(this); }

Ref<Image> CopyOfImage(const Image *src) {
    if (!src || !src->DownloadGPUMem()) return nullptr;
    auto img = MakeRef<Image>(src->width_, src->height_, src->depth_);
    img->xScale_ = src->xScale_;
    img->yScale_ = src->yScale_;
    img->dataWindow_ = src->dataWindow_;
    img->validWindow_ = src->validWindow_;
    img->canvas_ = src->canvas_;
    img->attrs_ = src->attrs_;
    img->metadata_ = src->metadata_;
    img->abort_ = src->abort_;
    img->noData_ = src->noData_;
    img->opaque_ = src->opaque_;
    for (const auto &plane : src->aux_) img->AddAuxChannel(plane.kind);
    if (src->HasScanLineData()) {
        if (!img->AllocScanLineData()) return nullptr;
        std::memcpy(img->pixels_.get(), src->pixels_.get(), src->RowBytes() * src->dataWindow_.Height());
        const size_t planeFloats = static_cast<size_t>(src->dataWindow_.Width()) * src->dataWindow_.Height();
        for (size_t i = 0; i < src->aux_.size(); ++i)
            if (src->aux_[i].data && img->aux_[i].data)
                std::memcpy(img->aux_[i].Floats(), src->aux_[i].Floats(), planeFloats * sizeof(float));
    }
    return img;
}

} // namespace Orvane
