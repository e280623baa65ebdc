#pragma once
// GPUMemory: the device side of an Image.
//
// An image may hold one GPUMemory (Image::GetGPUMem / SetGPUMem): a device
// image (KROMDialect.h layout) of the image's data window on one context.
// When a tool made the image on the device, main memory lags behind
// (Image::IsGPUMemDirty) until someone calls Image::DownloadGPUMem; an image
// uploaded for a kernel keeps its upload here, so the next device tool reads
// it without a second upload.
//
// Share locks guard the device image while a kernel runs: any number of
// readers (mode GPUShareRead) or one writer (GPUShareWrite).
//
// Ownership: reference counted (Use/Recycle); it holds the device memory.
// Thread safety: share locks may be taken from any thread; the rest is fixed
// at construction.
#include <condition_variable>
#include <memory>
#include <mutex>

#include "host/core/Object.h"
#include "host/krom/KROMDialect.h"

namespace Orvane {

constexpr int GPUShareRead = 0;
constexpr int GPUShareWrite = 1;

/// GetFlags bits.
constexpr int GPUMemFlagImage = 1; ///< holds a device image with a header

class ORVANE_API GPUMemory : public RefObject {
public:
    GPUMemory(std::shared_ptr<IDeviceMemory> memory, const DeviceImageHeader &header);

    IDeviceMemory *GetIDeviceMemory() const { return memory_.get(); }
    const std::shared_ptr<IDeviceMemory> &Memory() const { return memory_; }
    IDeviceContext *GetIDeviceContext() const { return memory_->Context(); }
    const DeviceImageHeader &Header() const { return header_; }
    int GetFlags() const { return GPUMemFlagImage; }
    size_t SizeOf() const override { return sizeof(*this) + memory_->Size(); }

    /// Takes a read (GPUShareRead) or write (GPUShareWrite) lock; with `wait`
    /// false, gives up at once when it is held the other way.
    bool ObtainShareLock(int mode, bool wait);
    /// Gives back the lock this holder took.
    void ReleaseShareLock();

private:
    std::shared_ptr<IDeviceMemory> memory_;
    DeviceImageHeader header_;
    std::mutex lock_;
    std::condition_variable released_;
    int readers_ = 0;
    bool writer_ = false;
};

} // namespace Orvane
