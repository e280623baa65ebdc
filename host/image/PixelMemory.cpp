#include "host/image/PixelMemory.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <list>
#include <mutex>
#include <sys/mman.h>
#include <unistd.h>
#include <utility>
#include <vector>

#include "host/core/Parallel.h"

namespace Orvane {
namespace {

/// Blocks from this size on are pooled and aligned for huge pages.
constexpr size_t LargeBlock = size_t(1) << 20;
constexpr size_t HugePage = size_t(2) << 20;

/// Three quarters of the machine's memory: the limit when none is set.
size_t DefaultLimit() {
    const long pages = sysconf(_SC_PHYS_PAGES), pageSize = sysconf(_SC_PAGESIZE);
    if (pages <= 0 || pageSize <= 0) return size_t(16) << 30;
    return static_cast<size_t>(pages) / 4 * 3 * static_cast<size_t>(pageSize);
}

struct PixelPool {
    std::mutex lock;                                // the fields below
    std::list<std::pair<size_t, uint8_t *>> blocks; // front: most recently freed
    size_t bytes = 0;                               // in the pool
    size_t live = 0;                                // handed out
    size_t peak = 0;
    size_t limit = DefaultLimit();
    std::string source; // the setting's name in messages; empty: "the memory limit"
#if defined(__SANITIZE_ADDRESS__)
    size_t poolLimit = 0; // every block back to the heap, so a use after release is reported
#else
    size_t poolLimit = size_t(1) << 30;
#endif
    std::mutex reclaimLock; // the reclaimers, and their calls
    std::vector<std::pair<int, PixelReclaimer>> reclaimers;
    int nextReclaimer = 1;
};

PixelPool &ThePixelPool() {
    static PixelPool *pool = new PixelPool; // lives for the process: images may be freed during static teardown
    return *pool;
}

/// Runs `f` on the pool under its lock.
template <class F> auto Locked(F f) {
    PixelPool &p = ThePixelPool();
    std::lock_guard<std::mutex> guard(p.lock);
    return f(p);
}

/// The calling thread's last refusal.
struct Refusal {
    bool pending = false;
    uint64_t bytes = 0;
    std::string what, limit; // the limit in words, with what was in use
};
thread_local Refusal t_refusal;
thread_local bool t_reclaiming = false;

size_t RoundUp(size_t bytes, size_t to) { return (bytes + to - 1) / to * to; }

/// Frees pooled blocks, oldest first, until the pool holds at most `keep`.
void ReleaseLocked(PixelPool &p, size_t keep) {
    while (p.bytes > keep && !p.blocks.empty()) {
        p.bytes -= p.blocks.back().first;
        std::free(p.blocks.back().second);
        p.blocks.pop_back();
    }
}

std::string LimitTextLocked(const PixelPool &p) {
    return (p.source.empty() ? std::string("the memory limit") : p.source) + " is " + FormatBytes(p.limit);
}

void CountLocked(PixelPool &p, size_t bytes) {
    p.live += bytes;
    p.peak = std::max(p.peak, p.live + p.bytes);
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

/// Asks the reclaimers for `wanted` bytes, one after the other.
void Reclaim(PixelPool &p, size_t wanted) {
    if (t_reclaiming) return; // a reclaimer's own allocation does not reclaim again
    std::lock_guard<std::mutex> guard(p.reclaimLock);
    t_reclaiming = true;
    size_t freed = 0;
    for (auto &[id, reclaimer] : p.reclaimers) {
        freed += reclaimer(wanted - std::min(freed, wanted));
        if (freed >= wanted) break;
    }
    t_reclaiming = false;
}

/// The system's block of `bytes` (uncounted), zeroed; null when it has none.
uint8_t *SystemBlock(size_t bytes) {
    if (bytes < LargeBlock) return static_cast<uint8_t *>(std::calloc(bytes, 1));
    auto *block = static_cast<uint8_t *>(std::aligned_alloc(HugePage, RoundUp(bytes, HugePage)));
    if (!block) return nullptr;
    madvise(block, RoundUp(bytes, HugePage), MADV_HUGEPAGE); // a hint; refusal is harmless
    ZeroLarge(block, bytes);
    return block;
}

} // namespace

uint8_t *AllocPixels(size_t bytes) {
    if (bytes == 0) bytes = 1;
    PixelPool &p = ThePixelPool();
    for (bool reclaimed = false;; reclaimed = true) {
        uint8_t *reused = nullptr;
        size_t over = 0;
        {
            std::lock_guard<std::mutex> guard(p.lock);
            auto same =
                std::find_if(p.blocks.begin(), p.blocks.end(), [bytes](const auto &b) { return b.first == bytes; });
            const size_t room = p.limit - std::min(p.limit, p.live);
            if (same != p.blocks.end()) {
                reused = same->second;
                p.bytes -= bytes;
                p.blocks.erase(same);
            } else if (bytes <= room) {
                ReleaseLocked(p, room - bytes); // the pool gives way first
            }
            const size_t held = p.live + p.bytes;
            if (reused || (held <= p.limit && bytes <= p.limit - held)) { // no sum that could wrap
                CountLocked(p, bytes);
            } else if (reclaimed || bytes > p.limit) {
                // What else is held matters only when the block alone would fit.
                t_refusal = {true, bytes, {}, LimitTextLocked(p)};
                if (held && bytes <= p.limit) t_refusal.limit += ", " + FormatBytes(held) + " of it in use";
                return nullptr;
            } else {
                over = held + bytes - p.limit;
            }
        }
        if (over) {
            Reclaim(p, over); // then once more: what was let go may now be in the pool
            continue;
        }
        if (reused) {
            ZeroLarge(reused, bytes);
            return reused;
        }
        if (uint8_t *block = SystemBlock(bytes)) return block;
        std::lock_guard<std::mutex> guard(p.lock);
        p.live -= bytes;
        t_refusal = {true, bytes, {}, "the system has no more memory"};
        return nullptr;
    }
}

void FreePixels(uint8_t *block, size_t bytes) {
    if (!block) return;
    if (bytes == 0) bytes = 1;
    PixelPool &p = ThePixelPool();
    std::lock_guard<std::mutex> guard(p.lock);
    p.live -= std::min(p.live, bytes);
    if (bytes < LargeBlock || bytes > p.poolLimit) {
        std::free(block);
        return;
    }
    ReleaseLocked(p, p.poolLimit - bytes);
    p.blocks.emplace_front(bytes, block);
    p.bytes += bytes;
}

void SetPixelPoolLimit(size_t bytes) {
    Locked([bytes](PixelPool &p) {
        p.poolLimit = bytes;
        ReleaseLocked(p, bytes);
    });
}

size_t PixelPoolLimit() {
    return Locked([](PixelPool &p) { return p.poolLimit; });
}

size_t PixelPoolBytes() {
    return Locked([](PixelPool &p) { return p.bytes; });
}

void SetPixelMemoryLimit(size_t bytes, const char *source) {
    Locked([&](PixelPool &p) {
        p.limit = bytes ? bytes : DefaultLimit();
        p.source = bytes && source ? source : "";
        ReleaseLocked(p, p.limit - std::min(p.limit, p.live));
    });
}

size_t PixelMemoryLimit() {
    return Locked([](PixelPool &p) { return p.limit; });
}

size_t PixelMemoryInUse() {
    return Locked([](PixelPool &p) { return p.live + p.bytes; });
}

size_t PixelMemoryPeak() {
    return Locked([](PixelPool &p) { return p.peak; });
}

void ResetPixelMemoryPeak() {
    Locked([](PixelPool &p) { p.peak = p.live + p.bytes; });
}

int AddPixelReclaimer(PixelReclaimer reclaimer) {
    PixelPool &p = ThePixelPool();
    std::lock_guard<std::mutex> guard(p.reclaimLock);
    p.reclaimers.emplace_back(p.nextReclaimer, std::move(reclaimer));
    return p.nextReclaimer++;
}

void RemovePixelReclaimer(int id) {
    PixelPool &p = ThePixelPool();
    std::lock_guard<std::mutex> guard(p.reclaimLock);
    std::erase_if(p.reclaimers, [id](const auto &r) { return r.first == id; });
}

void NamePixelRefusal(const std::string &what) {
    if (t_refusal.pending) t_refusal.what = what;
}

std::string TakePixelRefusal() {
    if (!t_refusal.pending) return {};
    std::string text = "needs " + FormatBytes(t_refusal.bytes);
    if (!t_refusal.what.empty()) text += " for " + t_refusal.what;
    text += "; " + t_refusal.limit;
    t_refusal = {};
    return text;
}

bool PixelMemoryRefused() { return t_refusal.pending; }

void ClearPixelRefusal() { t_refusal = {}; }

std::string PixelLimitRefusal(uint64_t bytes, const std::string &what) {
    return Locked([&](PixelPool &p) {
        return bytes <= p.limit ? std::string()
                                : "needs " + FormatBytes(bytes) + " for " + what + "; " + LimitTextLocked(p);
    });
}

std::string FormatBytes(uint64_t bytes) {
    char text[32];
    if (bytes >= (uint64_t(1) << 30)) {
        std::snprintf(text, sizeof text, "%.1f", std::ceil(bytes / double(uint64_t(1) << 30) * 10) / 10);
        std::string s = text;
        if (s.size() > 2 && s.compare(s.size() - 2, 2, ".0") == 0) s.resize(s.size() - 2);
        return s + " GiB";
    }
    if (bytes >= LargeBlock) return std::to_string((bytes + LargeBlock - 1) / LargeBlock) + " MiB";
    if (bytes >= 1024) return std::to_string((bytes + 1023) / 1024) + " KiB";
    return std::to_string(bytes) + " bytes";
}

} // namespace Orvane
