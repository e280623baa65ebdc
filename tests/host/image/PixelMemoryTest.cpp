// Pixel memory: zeroed blocks, reuse by size, the pool's limit, and the process limit: the pool emptied, the
// reclaimers asked, and only then a refusal saying what was needed.
#include "host/image/PixelMemory.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <vector>

namespace Orvane::pixelmemorytest {
namespace {

/// Restores the pool limit and the memory limit when a test ends.
struct LimitGuard {
    size_t saved = PixelPoolLimit();
    ~LimitGuard() {
        SetPixelPoolLimit(saved);
        SetPixelMemoryLimit(0);
        ClearPixelRefusal();
    }
};

TEST(PixelMemory, BlocksComeBackZeroedAndFrameSizedOnesAreReusedBySize) {
    LimitGuard guard;
    SetPixelPoolLimit(size_t(64) << 20);
    for (size_t bytes : {size_t(1), size_t(4096), size_t(3) << 20})
        for (int round = 0; round < 2; ++round) { // the second block may be the first one again
            uint8_t *a = AllocPixels(bytes);
            ASSERT_NE(a, nullptr);
            EXPECT_TRUE(std::all_of(a, a + bytes, [](uint8_t b) { return b == 0; })) << bytes << " round " << round;
            std::memset(a, 0xab, bytes);
            FreePixels(a, bytes);
        }
#if defined(__SANITIZE_ADDRESS__)
    GTEST_SKIP() << "the pool is off under AddressSanitizer";
#endif
    SetPixelPoolLimit(0); // empty the pool
    SetPixelPoolLimit(size_t(64) << 20);
    const size_t frame = size_t(8) << 20, other = size_t(5) << 20;
    uint8_t *a = AllocPixels(frame);
    FreePixels(a, frame);
    EXPECT_EQ(PixelPoolBytes(), frame);
    uint8_t *b = AllocPixels(other); // another size does not take it
    EXPECT_EQ(PixelPoolBytes(), frame);
    uint8_t *c = AllocPixels(frame);
    EXPECT_TRUE(c == a && PixelPoolBytes() == 0u);
    FreePixels(b, other);
    FreePixels(c, frame);
    EXPECT_EQ(PixelPoolBytes(), frame + other);
}

TEST(PixelMemory, ThePoolKeepsToItsLimitAndTheProcessLimitEmptiesItAsksReclaimersThenRefuses) {
    LimitGuard guard;
    SetPixelPoolLimit(0);
    const size_t block = size_t(4) << 20;
    SetPixelPoolLimit(3 * block);
    std::vector<uint8_t *> blocks;
    for (int i = 0; i < 5; ++i) blocks.push_back(AllocPixels(block + static_cast<size_t>(i) * 4096));
    for (int i = 0; i < 5; ++i) FreePixels(blocks[i], block + static_cast<size_t>(i) * 4096);
    EXPECT_LE(PixelPoolBytes(), 3 * block);
    SetPixelPoolLimit(block + 8192);
    EXPECT_LE(PixelPoolBytes(), block + 8192);
    // A block larger than the whole limit goes straight back to the system.
    uint8_t *big = AllocPixels(2 * block);
    FreePixels(big, 2 * block);
    EXPECT_LE(PixelPoolBytes(), block + 8192);
    SetPixelPoolLimit(0);
    EXPECT_EQ(PixelPoolBytes(), 0u);
    // The process limit empties the pool, then asks the reclaimers, then refuses.
    SetPixelPoolLimit(0);
    SetPixelPoolLimit(size_t(64) << 20);
    const size_t chunk = size_t(4) << 20, other = chunk - 4096;
    const size_t base = PixelMemoryInUse(), limit = base + 3 * chunk;
    SetPixelMemoryLimit(limit, "--memory-limit");
    ResetPixelMemoryPeak();
    uint8_t *a = AllocPixels(chunk), *b = AllocPixels(chunk), *c = AllocPixels(chunk);
    ASSERT_TRUE(a && b && c);
    FreePixels(c, chunk);
    EXPECT_EQ(PixelPoolBytes(), chunk);
    // The pooled chunk does not fit the new size: it leaves to make room.
    uint8_t *d = AllocPixels(other);
    ASSERT_TRUE(d && PixelPoolBytes() == 0u);
    // Full: the reclaimer lets `b` go, which is then reused.
    std::vector<size_t> asked;
    const int id = AddPixelReclaimer([&](size_t wanted) -> size_t {
        asked.push_back(wanted);
        if (!b) return 0;
        FreePixels(b, chunk);
        b = nullptr;
        return chunk;
    });
    uint8_t *e = AllocPixels(chunk);
    ASSERT_TRUE(e && asked == std::vector<size_t>{other}); // what passes the limit
    // Nothing more to let go: refused, saying what and the limit, once.
    EXPECT_TRUE(!AllocPixels(chunk) && asked.size() == 2u);
    EXPECT_EQ(TakePixelRefusal(), "needs 4 MiB; --memory-limit is " + FormatBytes(limit) + ", " +
                                      FormatBytes(PixelMemoryInUse()) + " of it in use");
    EXPECT_TRUE(TakePixelRefusal().empty() && PixelMemoryPeak() <= limit);
    RemovePixelReclaimer(id);
    for (auto [p, n] : {std::pair{a, chunk}, {d, other}, {e, chunk}}) FreePixels(p, n);
    EXPECT_EQ(PixelMemoryInUse(), base + PixelPoolBytes());
    // More than the whole limit (a damaged header's size): refused, no reclaimer asked.
    for (size_t huge : {4 * chunk, size_t(1) << 62, ~size_t(0)}) EXPECT_EQ(AllocPixels(huge), nullptr);
    EXPECT_EQ(TakePixelRefusal(), "needs 17179869184 GiB; --memory-limit is " + FormatBytes(limit));
    EXPECT_EQ(asked.size(), 2u);
}

} // namespace
} // namespace Orvane::pixelmemorytest
