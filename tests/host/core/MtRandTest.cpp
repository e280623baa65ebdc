// The Mersenne Twister against the standard library's std::mt19937 (an independent implementation of the same
// sequence) and the sequence's published first output.
#include "host/core/MtRand.h"

#include <gtest/gtest.h>

#include <random>

namespace Orvane {
namespace {

TEST(MtRandTest, MatchesTheStandardSequence) {
    EXPECT_EQ(MtRand(5489u).Next32(), 3499211612u);
    EXPECT_EQ(MtRand().Next32(), 3499211612u); // unseeded: the default seed
    EXPECT_EQ(MtRand(5489u).mt_rand(), int(3499211612u >> 17));
    // Several seeds, past the first regeneration of the state (624 words).
    for (uint32_t seed : {0u, 1u, 5489u, 0x74529812u, 0xffffffffu}) {
        MtRand ours;
        ours.mt_srand(seed);
        std::mt19937 reference(seed);
        for (int i = 0; i < 1500; ++i) {
            const uint32_t want = static_cast<uint32_t>(reference());
            const int draw = ours.mt_rand();
            ASSERT_EQ(draw, int(want >> 17)) << "seed " << seed << ", draw " << i;
            ASSERT_GE(draw, 0);
            ASSERT_LE(draw, MtRand::kMax);
        }
    }
}

} // namespace
} // namespace Orvane
