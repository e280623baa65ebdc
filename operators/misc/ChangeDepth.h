#pragma once
// ChangeDepth: converts an image to another pixel depth (8- or 16-bit
// integer, 16- or 32-bit float), or keeps it. A single-channel image stays
// single-channel.
//
// Integer results round to the nearest step. With Dither, a narrowing to an
// integer depth (from float, or 16 bits to 8) instead adds a number in [0, 1)
// to the value in steps and cuts it down: each value lands on one of its two
// neighbouring steps, the higher one with a chance equal to how far above the
// lower it lies, so a smooth gradient loses its bands and an area keeps its
// mean. Values on a step, or within the input's own rounding of one, stay on
// it. The number comes from a hash of
// the pixel's place and channel, so a render repeats bit for bit and a region
// holds the same bits as the whole frame. Colour channels are dithered, not
// alpha (except the one channel of a single-channel image).
//
// Thread safety: Process reads its inputs and runs the rows; nothing is kept
// between requests.
#include <cstdint>

#include "host/flow/Operator.h"

namespace Orvane {

class ChangeDepth : public ThreadedOperator {
public:
    ChangeDepth(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

private:
    Input *depth_, *dither_;
    Input *input_;
    Output *output_;
};

/// The dither number in [0, 1) of channel c at (x, y).
inline double DitherAt(int x, int y, int c) {
    // A 32-bit integer hash (multiply and xor-shift rounds) of the three
    // numbers; its top 24 bits give the fraction.
    uint32_t h = static_cast<uint32_t>(x) * 0x9E3779B1u ^ static_cast<uint32_t>(y) * 0x85EBCA77u ^
                 static_cast<uint32_t>(c) * 0xC2B2AE3Du;
    h ^= h >> 16;
    h *= 0x7FEB352Du;
    h ^= h >> 15;
    h *= 0x846CA68Bu;
    h ^= h >> 16;
    return (h >> 8) * (1.0 / 16777216.0);
}

} // namespace Orvane
