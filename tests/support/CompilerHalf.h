#pragma once
// The compiler's half type, the reference for the half conversions. Clang before 15 has _Float16 on x86 only with
// AVX-512 FP16; its __fp16 converts through the compiler runtime (linked into the tests for Clang builds).
namespace Orvane::Test {
#if defined(__clang__) && !defined(__FLT16_MAX__)
using CompilerHalf = __fp16;
#else
using CompilerHalf = _Float16;
#endif
} // namespace Orvane::Test
