#pragma once
// Reuser: the allocator of every host and tool object. Freed blocks are kept
// on per-size free lists and handed out again, so the many small objects of a
// render (parameters, images, requests) do not go back to the system heap.
//
// Thread safety: allocation and release may happen on any thread; each size
// class has its own lock.
#include <cstddef>

#include "host/core/Export.h"

namespace Orvane {

class ORVANE_API Reuser {
public:
    static void *operator new(std::size_t size);
    static void operator delete(void *block, std::size_t size) noexcept;

    /// Blocks held on the free lists, for tests and memory reports.
    static std::size_t CachedBlocks();
    /// Returns every cached block to the system heap.
    static void Trim();
};

} // namespace Orvane
