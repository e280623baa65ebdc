#pragma once
// KROMBuffer: device memory for one kernel run: a device image made from an
// Image, a device image without one (tables), or a plain buffer.
//
// CreateImage(ctx, img, KROMBufferRead) reuses the image's own device image
// when it lives on `ctx`; otherwise it uploads the image's data window and
// keeps the upload on the image (Image::SetGPUMem, not dirty) for the next
// device tool. An image whose device image lives on another context is
// downloaded first. CreateImage(ctx, img, KROMBufferWrite) allocates a device
// image of img's data window and depth; the caller hands it to the image
// (SetGPUMem, dirty) once the kernel has run.
//
// With a null context (a kernel served by a provider on the CPU,
// KernelProvider.h) CreateImage(nullptr, img, flags) wraps the image itself:
// HostImage() gives it, and the provider reads or fills its rows.
//
// A device image's GPUMemory holds a share lock (read or write) for the
// buffer's life. Creation never fails outright: a buffer that could not be
// made says so through IsValid and Error.
//
// Ownership: the caller owns the buffer (unique_ptr); the device memory is
// shared with the image that keeps it.
// Thread safety: one buffer belongs to one run; different buffers are
// independent.
#include <memory>
#include <string>

#include "host/core/Object.h"
#include "host/krom/DeviceContext.h"

namespace Orvane {

class GPUMemory;
class Image;

constexpr unsigned KROMBufferRead = 0;
constexpr unsigned KROMBufferWrite = 8;

class ORVANE_API KROMBuffer {
public:
    ~KROMBuffer();
    KROMBuffer(const KROMBuffer &) = delete;
    KROMBuffer &operator=(const KROMBuffer &) = delete;

    static std::unique_ptr<KROMBuffer> CreateImage(IDeviceContext *ctx, const Image *img, unsigned flags);
    /// A device image of width x height pixels of `depth` (1..8), filled from
    /// `pixels` (rows bottom up, tightly packed) when given.
    static std::unique_ptr<KROMBuffer> CreateImage(IDeviceContext *ctx, int width, int height, int depth,
                                                   const void *pixels);
    /// A plain buffer of `size` bytes, filled from `data` when given.
    static std::unique_ptr<KROMBuffer> CreateBuffer(IDeviceContext *ctx, const void *data, size_t size, unsigned flags);
    /// A buffer over device memory another holder keeps (an image's GPUMemory).
    static std::unique_ptr<KROMBuffer> CreateShared(GPUMemory *mem, unsigned flags);

    /// Copies `size` bytes into the buffer (for images: the pixels).
    bool Upload(const void *data, size_t size);

    bool IsValid() const { return memory_ != nullptr || host_ != nullptr; }
    /// The image a host buffer wraps (null for device memory).
    const Image *HostImage() const { return host_; }
    const std::string &Error() const { return error_; }
    bool IsImage() const { return gpu_.Get() != nullptr; }
    /// The component order (KROMDialect.h) of a device image; 0 for a buffer.
    int GetCompOrder() const { return compOrder_; }
    IDeviceMemory *GetIDeviceMemory() const { return memory_.get(); }
    IDeviceContext *GetIDeviceContext() const { return context_; }
    /// The device image's GPUMemory (null for a plain buffer).
    GPUMemory *GetGPUMemory() const;
    int Width() const { return width_; }
    int Height() const { return height_; }

private:
    KROMBuffer();
    bool MakeImage(IDeviceContext *ctx, int width, int height, int depth, unsigned flags);
    bool Lock(unsigned flags);

    IDeviceContext *context_ = nullptr;
    const Image *host_ = nullptr;
    std::shared_ptr<IDeviceMemory> memory_;
    Ref<GPUMemory> gpu_;
    bool locked_ = false;
    int compOrder_ = 0, width_ = 0, height_ = 0;
    std::string error_;
};

/// The component order of an image depth (1..8).
ORVANE_API int CompOrderOfDepth(int depth);

} // namespace Orvane
