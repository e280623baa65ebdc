#include "host/image/PixelMemory.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <list>
#include <mutex>
#include <sys/mman.h>
#include <unistd.h>

#include "host/core/Parallel.h"

namespace Orvane {
namespace {

/// Blocks from this size on are pooled and aligned for huge pages.
constexpr size_t LargeBlock = size_t(1) << 20;
constexpr size_t HugePage = size_t(2) << 20;

struct PixelPool {
    std::mutex lock;
    std::list<std::pair<size_t, uint8_t *>> blocks; // front: most recently freed
    size_t bytes = 0;
#if defined(__SANITIZE_ADDRESS__)
    size_t limit = 0; // every block back to the heap, so a use after release is reported
#else
    size_t limit = size_t(1) << 30;
#endif
};

PixelPool &ThePixelPool() {
    static PixelPool *pool = new PixelPool; // lives for the process: images may be freed during static teardown
    return *pool;
}

size_t RoundUp(size_t bytes, size_t to) { return (bytes + to - 1) / to * to; }

void ReleaseLocked(PixelPool &p, size_t keep) {
    while (p.bytes > keep && !p.blocks.empty()) {
        p.bytes -= p.blocks.back().first;
        std::free(p.blocks.back().second);
        p.blocks.pop_back();
    }
}

/// Zeroes a large block with the workers: it is as wide as a frame.
void ZeroLarge(uint8_t *block, size_t bytes) {
    constexpr size_t Piece = size_t(4) << 20;
    const int pieces = static_cast<int>((bytes + Piece - 1) / Piece);
    ParallelFor(pieces, [&](int i) {
        const size_t at = static_cast<size_t>(i) * Piece;
        std::memset(block + at, 0, std::min(Piece, bytes - at));
    });
}

} // namespace

/// The largest block one image may take: half the machine's memory. A file
/// header that claims more is refused here instead of taking the machine down.
static size_t LargestBlock() {
    static const size_t largest = [] {
        const long pages = sysconf(_SC_PHYS_PAGES), pageSize = sysconf(_SC_PAGESIZE);
        if (pages <= 0 || pageSize <= 0) return size_t(16) << 30;
        return static_cast<size_t>(pages) / 2 * static_cast<size_t>(pageSize);
    }();
    return largest;
}

uint8_t *AllocPixels(size_t bytes) {
    if (bytes == 0) bytes = 1;
    if (bytes > LargestBlock()) return nullptr;
    if (bytes < LargeBlock) return static_cast<uint8_t *>(std::calloc(bytes, 1));
    PixelPool &p = ThePixelPool();
    uint8_t *block = nullptr;
    {
        std::lock_guard<std::mutex> guard(p.lock);
        auto it = std::find_if(p.blocks.begin(), p.blocks.end(), [bytes](const auto &b) { return b.first == bytes; });
        if (it != p.blocks.end()) {
            block = it->second;
            p.bytes -= it->first;
            p.blocks.erase(it);
        }
    }
    if (!block) {
        block = static_cast<uint8_t *>(std::aligned_alloc(HugePage, RoundUp(bytes, HugePage)));
        if (!block) return nullptr;
        madvise(block, RoundUp(bytes, HugePage), MADV_HUGEPAGE); // a hint; refusal is harmless
    }
    ZeroLarge(block, bytes);
    return block;
}

void FreePixels(uint8_t *block, size_t bytes) {
    if (!block) return;
    if (bytes == 0) bytes = 1;
    if (bytes < LargeBlock) {
        std::free(block);
        return;
    }
    PixelPool &p = ThePixelPool();
    std::lock_guard<std::mutex> guard(p.lock);
    if (bytes > p.limit) {
        std::free(block);
        return;
    }
    ReleaseLocked(p, p.limit - bytes);
    p.blocks.emplace_front(bytes, block);
    p.bytes += bytes;
}

void SetPixelPoolLimit(size_t bytes) {
    PixelPool &p = ThePixelPool();
    std::lock_guard<std::mutex> guard(p.lock);
    p.limit = bytes;
    ReleaseLocked(p, bytes);
}

size_t PixelPoolLimit() {
    PixelPool &p = ThePixelPool();
    std::lock_guard<std::mutex> guard(p.lock);
    return p.limit;
}

size_t PixelPoolBytes() {
    PixelPool &p = ThePixelPool();
    std::lock_guard<std::mutex> guard(p.lock);
    return p.bytes;
}

} // namespace Orvane
