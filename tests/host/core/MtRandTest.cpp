// The Mersenne Twister against std::mt19937 (an independent implementation of the same sequence) and the sequence's
// published first output.
#include "host/core/MtRand.h"

#include <gtest/gtest.h>

#include <random>

namespace Orvane {
namespace {

TEST(MtRandTest, MatchesTheStandardSequence) {
    EXPECT_EQ(MtRand(5489u).Next32(), 3499211612u);
    EXPECT_EQ(MtRand().Next32(), 3499211612u); // unseeded: the default seed
    for (uint32_t seed : {0u, 1u, 5489u, 0x74529812u, 0xffffffffu}) {
        MtRand ours(seed);
        std::mt19937 reference(seed);
        for (int i = 0; i < 1500; ++i) // past the first regeneration of the state (624 words)
            ASSERT_EQ(ours.mt_rand(), int(static_cast<uint32_t>(reference()) >> 17)) << seed << ", draw " << i;
    }
}

} // namespace
} // namespace Orvane
