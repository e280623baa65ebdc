#include "host/krom/KROMBuffer.h"

#include "host/image/Image.h"
#include "host/krom/GPUMemory.h"
#include "host/krom/KROMDialect.h"

namespace Orvane {

int CompOrderOfDepth(int depth) {
    const PixelFormat f = FormatOfDepth(depth);
    return (f.channels == 4 ? CompOrderRGBA : CompOrderAlpha) | (static_cast<int>(f.type) << 4);
}

KROMBuffer::KROMBuffer() = default;

KROMBuffer::~KROMBuffer() {
    if (locked_) gpu_->ReleaseShareLock();
}

GPUMemory *KROMBuffer::GetGPUMemory() const { return gpu_.Get(); }

bool KROMBuffer::Lock(unsigned flags) {
    locked_ = gpu_->ObtainShareLock(flags & KROMBufferWrite ? GPUShareWrite : GPUShareRead, true);
    return locked_;
}

bool KROMBuffer::MakeImage(IDeviceContext *ctx, int width, int height, int depth, unsigned flags) {
    context_ = ctx;
    const PixelFormat f = FormatOfDepth(depth);
    if (!ctx || f.channels == 0 || width < 0 || height < 0) {
        error_ = "no device or no image format";
        return false;
    }
    DeviceImageHeader header;
    header.width = width;
    header.height = height;
    header.rowBytes = width * f.BytesPerPixel();
    header.componentType = static_cast<int>(f.type);
    header.channels = f.channels;
    const size_t bytes = DeviceImageHeaderBytes + static_cast<size_t>(header.rowBytes) * static_cast<size_t>(height);
    std::shared_ptr<IDeviceMemory> mem = ctx->Allocate(bytes, &error_);
    if (!mem || !ctx->Write(*mem, 0, &header, sizeof header, &error_)) return false;
    gpu_ = Ref<GPUMemory>::Adopt(new GPUMemory(mem, header));
    memory_ = std::move(mem);
    compOrder_ = CompOrderOfDepth(depth);
    width_ = width;
    height_ = height;
    return Lock(flags);
}

std::unique_ptr<KROMBuffer> KROMBuffer::CreateImage(IDeviceContext *ctx, const Image *img, unsigned flags) {
    std::unique_ptr<KROMBuffer> buf(new KROMBuffer);
    buf->context_ = ctx;
    if (!img) {
        buf->error_ = "no image";
        return buf;
    }
    const ImgRectI dw = img->DataWindow();
    if (!ctx) {
        buf->host_ = img;
        buf->width_ = dw.Width();
        buf->height_ = dw.Height();
        return buf;
    }
    if (flags & KROMBufferWrite) {
        if (!buf->MakeImage(ctx, dw.Width(), dw.Height(), img->Depth(), flags)) buf->memory_.reset();
        return buf;
    }
    if (Ref<GPUMemory> own = img->GetGPUMem()) {
        const DeviceImageHeader &h = own->Header();
        if (own->GetIDeviceContext() == ctx && h.width == dw.Width() && h.height == dw.Height()) {
            buf->gpu_ = own;
            buf->compOrder_ = CompOrderOfDepth(img->Depth());
            buf->width_ = h.width;
            buf->height_ = h.height;
            if (buf->Lock(flags)) buf->memory_ = own->Memory();
            return buf;
        }
        // Another context's (or an outdated) device image: main memory must be current.
        if (!img->DownloadGPUMem()) {
            buf->error_ = "the image's device memory could not be brought back";
            return buf;
        }
    }
    // Upload the data window; an image without rows has no pixels to give.
    const bool hasRows = img->HasScanLineData();
    if (!buf->MakeImage(ctx, hasRows ? dw.Width() : 0, hasRows ? dw.Height() : 0, img->Depth(), flags) ||
        (hasRows && !ctx->Write(*buf->memory_, DeviceImageHeaderBytes, img->ScanLine(dw.y0),
                                img->RowBytes() * static_cast<size_t>(dw.Height()), &buf->error_))) {
        buf->memory_.reset();
        return buf;
    }
    if (hasRows) const_cast<Image *>(img)->SetGPUMem(buf->gpu_.Get(), false); // keep the upload for the next tool
    return buf;
}

std::unique_ptr<KROMBuffer> KROMBuffer::CreateImage(IDeviceContext *ctx, int width, int height, int depth,
                                                    const void *pixels) {
    std::unique_ptr<KROMBuffer> buf(new KROMBuffer);
    if (!buf->MakeImage(ctx, width, height, depth, KROMBufferRead) ||
        (pixels && !buf->Upload(pixels, static_cast<size_t>(buf->gpu_->Header().rowBytes) * height)))
        buf->memory_.reset();
    return buf;
}

std::unique_ptr<KROMBuffer> KROMBuffer::CreateBuffer(IDeviceContext *ctx, const void *data, size_t size, unsigned) {
    std::unique_ptr<KROMBuffer> buf(new KROMBuffer);
    buf->context_ = ctx;
    if (!ctx) {
        buf->error_ = "no device";
        return buf;
    }
    buf->memory_ = ctx->Allocate(size, &buf->error_);
    if (buf->memory_ && data && !ctx->Write(*buf->memory_, 0, data, size, &buf->error_)) buf->memory_.reset();
    return buf;
}

std::unique_ptr<KROMBuffer> KROMBuffer::CreateShared(GPUMemory *mem, unsigned flags) {
    std::unique_ptr<KROMBuffer> buf(new KROMBuffer);
    if (!mem) {
        buf->error_ = "no device memory";
        return buf;
    }
    buf->context_ = mem->GetIDeviceContext();
    buf->gpu_ = Ref<GPUMemory>(mem);
    const DeviceImageHeader &h = mem->Header();
    buf->width_ = h.width;
    buf->height_ = h.height;
    buf->compOrder_ = (h.channels == 4 ? CompOrderRGBA : CompOrderAlpha) | (h.componentType << 4);
    if (buf->Lock(flags)) buf->memory_ = mem->Memory();
    return buf;
}

bool KROMBuffer::Upload(const void *data, size_t size) {
    if (!memory_) return false;
    const size_t offset = gpu_ ? DeviceImageHeaderBytes : 0;
    if (offset + size > memory_->Size()) {
        error_ = "upload larger than the buffer";
        return false;
    }
    return context_->Write(*memory_, offset, data, size, &error_);
}

} // namespace Orvane
