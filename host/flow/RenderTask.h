#pragma once
// RenderTask: one render (a command-line frame range, an interactive view):
// its abort flag, its proxy scale, whether it is interactive, and whether it
// only wants bounds. Requests carry their task.
//
// Thread safety: Abort() may be called from any thread; the rest is set
// before the render starts.
#include <atomic>

#include "host/core/Export.h"

namespace Orvane {

class ORVANE_API RenderTask {
public:
    void Abort() { abort_.store(true, std::memory_order_relaxed); }
    bool IsAborted() const { return abort_.load(std::memory_order_relaxed); }
    const std::atomic<bool> *AbortFlag() const { return &abort_; }

    int proxyScale = 1;
    bool interactive = false;
    bool boundsOnly = false;
    bool useGPU = false;
    /// First frame of the render's range (-2e9: not a range render). Savers
    /// number their files from it when asked to.
    double startTime = -2e9;

private:
    std::atomic<bool> abort_{false};
};

} // namespace Orvane
