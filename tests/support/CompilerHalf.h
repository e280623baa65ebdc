#pragma once
// The compiler's half type, the reference for the half conversions. Clang before 15 has _Float16 on x86 only with
// AVX-512 FP16; its __fp16 converts through the compiler runtime (linked into the tests for Clang builds).
#include <cstdint>
#include <cstring>

namespace Orvane::Test {
#if defined(__clang__) && !defined(__FLT16_MAX__)
using CompilerHalf = __fp16;
#else
using CompilerHalf = _Float16;
#endif

/// The compiler's reading of the half bits `code`, widened to float (__fp16 cannot be the result of a bit_cast).
inline float CompilerHalfToFloat(uint16_t code) {
    CompilerHalf h;
    std::memcpy(&h, &code, sizeof h);
    return static_cast<float>(h);
}
} // namespace Orvane::Test
