#include "host/krom/GPUMemory.h"

#include <cstring>

#include "host/image/Image.h"
#include "host/krom/DeviceContext.h"

namespace Orvane {

GPUMemory::GPUMemory(std::shared_ptr<IDeviceMemory> memory, const DeviceImageHeader &header)
    : memory_(std::move(memory)), header_(header) {}

bool GPUMemory::ObtainShareLock(int mode, bool wait) {
    std::unique_lock<std::mutex> lock(lock_);
    auto free = [&] { return mode == GPUShareWrite ? !writer_ && readers_ == 0 : !writer_; };
    if (!free()) {
        if (!wait) return false;
        released_.wait(lock, free);
    }
    if (mode == GPUShareWrite)
        writer_ = true;
    else
        ++readers_;
    return true;
}

void GPUMemory::ReleaseShareLock() {
    {
        std::lock_guard<std::mutex> lock(lock_);
        if (writer_)
            writer_ = false;
        else if (readers_ > 0)
            --readers_;
    }
    released_.notify_all();
}

// ---- the device side of Image ----

Ref<GPUMemory> Image::GetGPUMem() const {
    std::lock_guard<std::mutex> lock(gpuLock_);
    return gpuMem_;
}

void Image::SetGPUMem(GPUMemory *mem, bool dirty) {
    std::lock_guard<std::mutex> lock(gpuLock_);
    gpuMem_ = Ref<GPUMemory>(mem);
    gpuDirty_ = mem && dirty;
}

bool Image::IsGPUMemDirty() const {
    std::lock_guard<std::mutex> lock(gpuLock_);
    return gpuDirty_;
}

void Image::SetGPUMemDirtyFlag(bool dirty) {
    std::lock_guard<std::mutex> lock(gpuLock_);
    gpuDirty_ = gpuMem_ && dirty;
}

bool Image::DownloadGPUMem() const {
    std::lock_guard<std::mutex> lock(gpuLock_);
    if (!gpuDirty_) return true;
    // Bringing main memory up to date does not change what the image holds,
    // so a shared image may do it too; the lock keeps two readers apart.
    auto *self = const_cast<Image *>(this);
    if (!self->AllocScanLineData()) return false;
    const size_t bytes = RowBytes() * static_cast<size_t>(dataWindow_.Height());
    if (bytes > 0) {
        std::string error;
        if (!gpuMem_->GetIDeviceContext()->Read(*gpuMem_->GetIDeviceMemory(), DeviceImageHeaderBytes, pixels_.get(),
                                                bytes, &error))
            return false;
    }
    self->gpuDirty_ = false;
    return true;
}

size_t Image::GPUBytes() const {
    std::lock_guard<std::mutex> lock(gpuLock_);
    return gpuMem_ ? gpuMem_->GetIDeviceMemory()->Size() : 0;
}

} // namespace Orvane
