#pragma once
// Little-endian fields of file headers, read from and written to byte
// buffers whatever the machine's own order. Shared by the BMP, Targa and Raw
// formats.
#include <cstdint>
#include <cstring>

namespace Orvane::LE {

inline uint16_t Get16(const uint8_t *p) { return static_cast<uint16_t>(p[0] | (p[1] << 8)); }
inline uint32_t Get32(const uint8_t *p) {
    return static_cast<uint32_t>(p[0]) | (static_cast<uint32_t>(p[1]) << 8) | (static_cast<uint32_t>(p[2]) << 16) |
           (static_cast<uint32_t>(p[3]) << 24);
}
inline int32_t GetS32(const uint8_t *p) { return static_cast<int32_t>(Get32(p)); }
inline int16_t GetS16(const uint8_t *p) { return static_cast<int16_t>(Get16(p)); }
inline uint64_t Get64(const uint8_t *p) { return Get32(p) | (static_cast<uint64_t>(Get32(p + 4)) << 32); }
inline double GetDouble(const uint8_t *p) {
    const uint64_t bits = Get64(p);
    double d;
    std::memcpy(&d, &bits, sizeof d);
    return d;
}

inline void Put16(uint8_t *p, uint32_t v) {
    p[0] = static_cast<uint8_t>(v);
    p[1] = static_cast<uint8_t>(v >> 8);
}
inline void Put32(uint8_t *p, uint32_t v) {
    for (int i = 0; i < 4; ++i) p[i] = static_cast<uint8_t>(v >> (8 * i));
}
inline void Put64(uint8_t *p, uint64_t v) {
    Put32(p, static_cast<uint32_t>(v));
    Put32(p + 4, static_cast<uint32_t>(v >> 32));
}
inline void PutDouble(uint8_t *p, double d) {
    uint64_t bits;
    std::memcpy(&bits, &d, sizeof bits);
    Put64(p, bits);
}

} // namespace Orvane::LE
