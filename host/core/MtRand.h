#pragma once
// MtRand: the 32-bit Mersenne Twister (MT19937) with its standard seeding,
// for values that must repeat exactly from a seed: a modifier's random draw
// at a given time.
//
//   MtRand gen;
//   gen.mt_srand(seed);      // the standard initialisation by one 32-bit seed
//   int r = gen.mt_rand();   // 0..32767: the top 15 bits of the next output
//
// A generator never seeded behaves as one seeded with 5489 (the sequence's
// usual default, whose first 32-bit output is 3499211612).
//
// Thread safety: a generator is a plain value; use one per thread (or per
// evaluation). There is no shared state.
#include <cstdint>

#include "host/core/Export.h"

namespace Orvane {

class ORVANE_API MtRand {
public:
    static constexpr int kMax = 32767;

    MtRand() { mt_srand(5489u); }
    explicit MtRand(uint32_t seed) { mt_srand(seed); }

    /// Starts the sequence of `seed`.
    void mt_srand(uint32_t seed);
    /// The next draw in 0..kMax.
    int mt_rand() { return static_cast<int>(Next32() >> 17); }
    /// The next full 32-bit output.
    uint32_t Next32();

private:
    static constexpr int kN = 624;
    uint32_t state_[kN];
    int index_ = kN;
};

} // namespace Orvane
