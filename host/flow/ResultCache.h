#pragma once
// ResultCache: results of tools kept for reuse, keyed by output, time, the
// request traits that change a result (pre-calculation, proxy, quick mode)
// and a hash of everything upstream that the result depends on (the tool's
// non-passive input values and, through links, the upstream hashes). An edit
// therefore never needs to invalidate anything: a changed flow hashes
// differently and old entries age out.
//
// A result made for a region of interest serves any request whose region it
// covers; a whole-frame result serves every region. Entries beyond the
// memory budget are evicted, least recently used first; a result larger than
// the whole budget is not kept and evicts nothing. The cache also gives
// way to pixel memory (PixelMemory.h): when an allocation would pass the
// process's limit, it drops the least recently used results that nobody but
// the cache holds.
//
// Thread safety: all operations lock the cache; results it lets go are
// released after the lock.
#include <cstdint>
#include <list>
#include <mutex>
#include <optional>
#include <unordered_map>

#include "host/flow/Parameter.h"
#include "host/image/Rect.h"

namespace Orvane {

class Output;

struct CacheKey {
    const Output *output = nullptr;
    double time = 0.0;
    uint32_t traits = 0;
    uint64_t state = 0;
    bool operator==(const CacheKey &) const = default;
};

struct CacheKeyHash {
    size_t operator()(const CacheKey &k) const;
};

class ORVANE_API ResultCache {
public:
    explicit ResultCache(size_t budgetBytes = size_t(2) << 30);
    ~ResultCache();
    ResultCache(const ResultCache &) = delete;
    ResultCache &operator=(const ResultCache &) = delete;

    /// A result whose region covers `roi` (absent: the whole frame).
    Ref<Parameter> Find(const CacheKey &key, const std::optional<ImageDomain> &roi);
    void Store(const CacheKey &key, const std::optional<ImageDomain> &roi, const Ref<Parameter> &value);

    void SetBudget(size_t bytes);
    size_t Budget() const;
    size_t Bytes() const;
    size_t Entries() const;
    void Clear();
    /// Drops the entries of one output (its tool is going away).
    void Forget(const Output *output);
    /// Drops least recently used results held by the cache alone until
    /// `wanted` bytes are let go; returns the bytes let go.
    size_t Reclaim(size_t wanted);

    struct Stats {
        uint64_t hits = 0, misses = 0, evictions = 0;
    };
    Stats GetStats() const;

private:
    struct Entry {
        CacheKey key;
        std::optional<ImageDomain> roi;
        Ref<Parameter> value;
        size_t bytes;
    };
    using EntryList = std::list<Entry>;
    void EvictLocked();
    /// Takes one entry out of the list and the index.
    void EraseLocked(EntryList::iterator it);

    mutable std::mutex lock_;
    size_t budget_, bytes_ = 0;
    EntryList lru_; // front: most recently used
    std::unordered_multimap<CacheKey, EntryList::iterator, CacheKeyHash> index_;
    Stats stats_;
    int reclaimer_;
};

} // namespace Orvane
