#include "host/core/Reuser.h"

#include <cstdlib>
#include <mutex>
#include <new>
#include <vector>

namespace Orvane {
namespace {

constexpr std::size_t Granule = 16;
#if defined(__SANITIZE_ADDRESS__)
// Under AddressSanitizer every block goes back to the heap at once, so a use
// after release is reported instead of hidden by reuse.
constexpr std::size_t MaxPooled = 0;
#else
constexpr std::size_t MaxPooled = 2048; // larger blocks go straight to the heap
#endif
constexpr std::size_t ClassCount = MaxPooled / Granule + 1;
constexpr std::size_t MaxKeptPerClass = 4096;

struct SizeClass {
    std::mutex lock;
    std::vector<void *> free;
};

SizeClass *Classes() {
    static SizeClass *classes = new SizeClass[ClassCount]; // kept for the life of the process
    return classes;
}

std::size_t ClassOf(std::size_t size) { return (size + Granule - 1) / Granule - 1; }

} // namespace

void *Reuser::operator new(std::size_t size) {
    if (size == 0) size = 1;
    if (size <= MaxPooled) {
        SizeClass &c = Classes()[ClassOf(size)];
        {
            std::lock_guard<std::mutex> guard(c.lock);
            if (!c.free.empty()) {
                void *block = c.free.back();
                c.free.pop_back();
                return block;
            }
        }
        size = (ClassOf(size) + 1) * Granule;
    }
    void *block = std::malloc(size);
    if (!block) throw std::bad_alloc();
    return block;
}

void Reuser::operator delete(void *block, std::size_t size) noexcept {
    if (!block) return;
    if (size == 0) size = 1;
    if (size <= MaxPooled) {
        SizeClass &c = Classes()[ClassOf(size)];
        std::lock_guard<std::mutex> guard(c.lock);
        if (c.free.size() < MaxKeptPerClass) {
            try {
                c.free.push_back(block);
                return;
            } catch (...) {
            }
        }
    }
    std::free(block);
}

std::size_t Reuser::CachedBlocks() {
    std::size_t total = 0;
    for (std::size_t i = 0; i < ClassCount; ++i) {
        std::lock_guard<std::mutex> guard(Classes()[i].lock);
        total += Classes()[i].free.size();
    }
    return total;
}

void Reuser::Trim() {
    for (std::size_t i = 0; i < ClassCount; ++i) {
        std::lock_guard<std::mutex> guard(Classes()[i].lock);
        for (void *block : Classes()[i].free) std::free(block);
        Classes()[i].free.clear();
    }
}

} // namespace Orvane
