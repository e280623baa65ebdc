#pragma once
// Run-length packets of the Targa kind, also used by the Raw format: a header
// byte with the top bit set is followed by one element repeated
// (low 7 bits + 1) times; a header byte without it by (low 7 bits + 1)
// literal elements. Packets hold 1 to 128 elements.
//
// Thread safety: plain functions.
#include <cstddef>
#include <cstdint>
#include <cstring>

namespace Orvane {

/// Packs `count` elements of `N` bytes; returns the bytes written to `out`,
/// which must hold count * (N + 1) bytes.
template <int N> size_t RunLengthEncode(const uint8_t *src, int count, uint8_t *out) {
    auto same = [src](int a, int b) { return std::memcmp(src + a * N, src + b * N, N) == 0; };
    uint8_t *o = out;
    int i = 0;
    while (i < count) {
        int j = i + 1;
        if (j < count && same(i, j)) {
            while (j < count && j - i < 128 && same(i, j)) ++j;
            *o++ = static_cast<uint8_t>(0x80 | (j - i - 1));
            std::memcpy(o, src + i * N, N);
            o += N;
        } else {
            while (j < count && j - i < 128 && !(j + 1 < count && same(j, j + 1))) ++j;
            *o++ = static_cast<uint8_t>(j - i - 1);
            std::memcpy(o, src + i * N, static_cast<size_t>(j - i) * N);
            o += static_cast<size_t>(j - i) * N;
        }
        i = j;
    }
    return static_cast<size_t>(o - out);
}

} // namespace Orvane
