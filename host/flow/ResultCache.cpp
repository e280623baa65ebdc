#include "host/flow/ResultCache.h"

#include <vector>

#include "host/image/PixelMemory.h"

namespace Orvane {

size_t CacheKeyHash::operator()(const CacheKey &k) const {
    uint64_t h = HashMix(HashBytes(&k.output, sizeof k.output), HashDouble(k.time));
    h = HashMix(h, k.traits);
    return static_cast<size_t>(HashMix(h, k.state));
}

ResultCache::ResultCache(size_t budgetBytes)
    : budget_(budgetBytes), reclaimer_(AddPixelReclaimer([this](size_t wanted) { return Reclaim(wanted); })) {}

ResultCache::~ResultCache() { RemovePixelReclaimer(reclaimer_); }

void ResultCache::EraseLocked(EntryList::iterator it) {
    auto [first, last] = index_.equal_range(it->key);
    for (auto ix = first; ix != last; ++ix)
        if (ix->second == it) {
            index_.erase(ix);
            break;
        }
    bytes_ -= it->bytes;
    lru_.erase(it);
}

size_t ResultCache::Reclaim(size_t wanted) {
    std::vector<Ref<Parameter>> released; // freed after the lock
    size_t freed = 0;
    {
        std::lock_guard<std::mutex> guard(lock_);
        for (auto it = lru_.end(); it != lru_.begin() && freed < wanted;) {
            --it;
            if (it->value->RefCount() != 1) continue; // someone still holds it: dropping frees nothing
            freed += it->bytes;
            released.push_back(std::move(it->value));
            it = std::next(it);
            EraseLocked(std::prev(it));
            ++stats_.evictions;
        }
    }
    return freed;
}

Ref<Parameter> ResultCache::Find(const CacheKey &key, const std::optional<ImageDomain> &roi) {
    std::lock_guard<std::mutex> guard(lock_);
    auto [first, last] = index_.equal_range(key);
    for (auto it = first; it != last; ++it) {
        Entry &e = *it->second;
        const bool covers = !e.roi || (roi && e.roi->rect.Contains(roi->rect));
        if (!covers) continue;
        lru_.splice(lru_.begin(), lru_, it->second);
        ++stats_.hits;
        return e.value;
    }
    ++stats_.misses;
    return nullptr;
}

void ResultCache::Store(const CacheKey &key, const std::optional<ImageDomain> &roi, const Ref<Parameter> &value) {
    if (!value) return;
    const size_t bytes = value->SizeOf();
    std::lock_guard<std::mutex> guard(lock_);
    // A value larger than the whole budget is not kept, and evicts nothing.
    if (bytes > budget_) return;
    // A whole-frame result replaces region results of the same key.
    auto [first, last] = index_.equal_range(key);
    std::vector<decltype(first)> stale;
    for (auto it = first; it != last; ++it)
        if (!roi || (it->second->roi && roi->rect.Contains(it->second->roi->rect))) stale.push_back(it);
    for (auto it : stale) {
        bytes_ -= it->second->bytes;
        lru_.erase(it->second);
        index_.erase(it);
    }
    lru_.push_front(Entry{key, roi, value, bytes});
    index_.emplace(key, lru_.begin());
    bytes_ += bytes;
    EvictLocked();
}

void ResultCache::EvictLocked() {
    while (bytes_ > budget_ && !lru_.empty()) {
        EraseLocked(std::prev(lru_.end()));
        ++stats_.evictions;
    }
}

void ResultCache::SetBudget(size_t bytes) {
    std::lock_guard<std::mutex> guard(lock_);
    budget_ = bytes;
    EvictLocked();
}

size_t ResultCache::Budget() const {
    std::lock_guard<std::mutex> guard(lock_);
    return budget_;
}

size_t ResultCache::Bytes() const {
    std::lock_guard<std::mutex> guard(lock_);
    return bytes_;
}

size_t ResultCache::Entries() const {
    std::lock_guard<std::mutex> guard(lock_);
    return lru_.size();
}

void ResultCache::Clear() {
    std::lock_guard<std::mutex> guard(lock_);
    index_.clear();
    lru_.clear();
    bytes_ = 0;
}

void ResultCache::Forget(const Output *output) {
    std::lock_guard<std::mutex> guard(lock_);
    for (auto it = lru_.begin(); it != lru_.end();) {
        auto next = std::next(it);
        if (it->key.output == output) EraseLocked(it);
        it = next;
    }
}

ResultCache::Stats ResultCache::GetStats() const {
    std::lock_guard<std::mutex> guard(lock_);
    return stats_;
}

} // namespace Orvane
