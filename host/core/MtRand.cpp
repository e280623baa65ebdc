#include "host/core/MtRand.h"

namespace Orvane {

void MtRand::mt_srand(uint32_t seed) {
    state_[0] = seed;
    for (int i = 1; i < kN; ++i) state_[i] = 1812433253u * (state_[i - 1] ^ (state_[i - 1] >> 30)) + uint32_t(i);
    index_ = kN;
}

uint32_t MtRand::Next32() {
    constexpr int kM = 397;
    constexpr uint32_t kMatrix = 0x9908b0dfu, kUpper = 0x80000000u, kLower = 0x7fffffffu;
    if (index_ >= kN) {
        // Regenerates the whole block of 624 words at once.
        for (int i = 0; i < kN; ++i) {
            const uint32_t y = (state_[i] & kUpper) | (state_[(i + 1) % kN] & kLower);
            state_[i] = state_[(i + kM) % kN] ^ (y >> 1) ^ ((y & 1u) ? kMatrix : 0u);
        }
        index_ = 0;
    }
    uint32_t y = state_[index_++];
    y ^= y >> 11;
    y ^= (y << 7) & 0x9d2c5680u;
    y ^= (y << 15) & 0xefc60000u;
    y ^= y >> 18;
    return y;
}

} // namespace Orvane
