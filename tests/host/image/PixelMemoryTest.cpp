// Pixel memory: blocks come back zeroed, frame-sized blocks are reused, and
// the pool keeps no more than its limit.
#include "host/image/PixelMemory.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <vector>

namespace Orvane::pixelmemorytest {
namespace {

/// Restores the pool limit when a test ends.
struct LimitGuard {
    size_t saved = PixelPoolLimit();
    ~LimitGuard() { SetPixelPoolLimit(saved); }
};

TEST(PixelMemory, BlocksOfEverySizeComeBackZeroedEvenWhenReused) {
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
}

TEST(PixelMemory, FrameSizedBlocksAreReusedBySize) {
#if defined(__SANITIZE_ADDRESS__)
    GTEST_SKIP() << "the pool is off under AddressSanitizer";
#endif
    LimitGuard guard;
    SetPixelPoolLimit(0); // empty the pool
    SetPixelPoolLimit(size_t(64) << 20);
    const size_t frame = size_t(8) << 20, other = size_t(5) << 20;
    uint8_t *a = AllocPixels(frame);
    FreePixels(a, frame);
    EXPECT_EQ(PixelPoolBytes(), frame);
    uint8_t *b = AllocPixels(other); // another size does not take it
    EXPECT_EQ(PixelPoolBytes(), frame);
    uint8_t *c = AllocPixels(frame);
    EXPECT_EQ(c, a);
    EXPECT_EQ(PixelPoolBytes(), 0u);
    FreePixels(b, other);
    FreePixels(c, frame);
    EXPECT_EQ(PixelPoolBytes(), frame + other);
}

TEST(PixelMemory, ThePoolKeepsNoMoreThanItsLimitAndRefusesImpossibleBlocks) {
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
    // A damaged header may claim any size; the allocation must fail cleanly.
    EXPECT_EQ(AllocPixels(size_t(1) << 62), nullptr);
    EXPECT_EQ(AllocPixels(static_cast<size_t>(-1)), nullptr);
}

} // namespace
} // namespace Orvane::pixelmemorytest
