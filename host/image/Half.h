#pragma once
// IEEE 754 binary16 conversion, exact in both directions (round to nearest
// even on the way down; infinities and NaN kept).
#include <cstdint>
#include <cstring>

namespace Orvane {

inline float HalfToFloat(uint16_t h) {
    const uint32_t sign = static_cast<uint32_t>(h & 0x8000u) << 16;
    uint32_t exp = (h >> 10) & 0x1fu;
    uint32_t mant = h & 0x3ffu;
    uint32_t bits;
    if (exp == 0) {
        if (mant == 0) {
            bits = sign;
        } else { // subnormal: normalise
            exp = 127 - 15 + 1;
            while ((mant & 0x400u) == 0) {
                mant <<= 1;
                --exp;
            }
            mant &= 0x3ffu;
            bits = sign | (exp << 23) | (mant << 13);
        }
    } else if (exp == 0x1f) {
        bits = sign | 0x7f800000u | (mant << 13);
    } else {
        bits = sign | ((exp + 127 - 15) << 23) | (mant << 13);
    }
    float f;
    std::memcpy(&f, &bits, sizeof f);
    return f;
}

inline uint16_t FloatToHalf(float f) {
    uint32_t bits;
    std::memcpy(&bits, &f, sizeof bits);
    const uint16_t sign = static_cast<uint16_t>((bits >> 16) & 0x8000u);
    const uint32_t absBits = bits & 0x7fffffffu;
    if (absBits >= 0x7f800000u) // inf or NaN
        return sign | 0x7c00u | (absBits > 0x7f800000u ? 0x200u | ((absBits >> 13) & 0x3ffu) : 0u);
    if (absBits >= 0x477ff000u) return sign | 0x7c00u; // rounds to beyond the largest half
    if (absBits < 0x38800000u) {                       // result is subnormal or zero
        if (absBits < 0x33000000u) return sign;        // below half of the smallest subnormal
        const uint32_t exp = absBits >> 23;
        const uint32_t mant = (absBits & 0x7fffffu) | 0x800000u;
        const uint32_t shift = 126 - exp; // 14 + (113 - exp) - 1 ... aligns to 2^-24 units
        uint32_t result = mant >> (shift - 0 + 0);
        // round to nearest even on the bits shifted out
        const uint32_t rest = mant & ((1u << shift) - 1u);
        const uint32_t halfway = 1u << (shift - 1);
        if (rest > halfway || (rest == halfway && (result & 1u))) ++result;
        return sign | static_cast<uint16_t>(result);
    }
    uint32_t result = ((absBits - 0x38000000u) >> 13); // rebias exponent 127 -> 15
    const uint32_t rest = absBits & 0x1fffu;
    if (rest > 0x1000u || (rest == 0x1000u && (result & 1u))) ++result;
    return sign | static_cast<uint16_t>(result);
}

} // namespace Orvane
