#pragma once
// Converting runs of stored pixels to and from FltPixel and Pixel, for every
// depth. Float to integer rounds to nearest and clamps to the integer range;
// 8-bit values widen to 16 bits by 257. Single-channel data reads into all
// four channels and writes from alpha.
//
// Thread safety: pure functions.
#include <cstdint>

#include "host/image/Pixel.h"

namespace Orvane {

class Image;

ORVANE_API void LoadFlt(int depth, const uint8_t *src, int count, FltPixel *dst);
ORVANE_API void StoreFlt(int depth, const FltPixel *src, int count, uint8_t *dst);
ORVANE_API void LoadPixel(int depth, const uint8_t *src, int count, Pixel *dst);
ORVANE_API void StorePixel(int depth, const Pixel *src, int count, uint8_t *dst);
/// Single-channel depths only: one float per pixel, the value LoadFlt reads
/// into each channel and StoreFlt writes from alpha.
ORVANE_API void LoadMaskFlt(int depth, const uint8_t *src, int count, float *dst);
ORVANE_API void StoreMaskFlt(int depth, const float *src, int count, uint8_t *dst);

ORVANE_API Pixel FltToPixel(const FltPixel &f);
ORVANE_API FltPixel PixelToFlt(const Pixel &p);

/// Reads x0..x1-1 of row y of `img` as floats: the image's pixels inside its
/// data window, its canvas colour outside (the left, middle and right spans).
ORVANE_API void ReadSpanFlt(const Image &img, int y, int x0, int x1, FltPixel *dst);

// The products are taken in double, where v * 65535 + 0.5 is exact: in float
// the product rounds first and can carry a value just below a half-way point up a code.
inline uint16_t FloatToU16(float v) {
    if (!(v > 0.f)) return 0; // also NaN
    if (v >= 1.f) return 65535;
    return static_cast<uint16_t>(static_cast<double>(v) * 65535.0 + 0.5);
}
inline uint8_t FloatToU8(float v) {
    if (!(v > 0.f)) return 0;
    if (v >= 1.f) return 255;
    return static_cast<uint8_t>(static_cast<double>(v) * 255.0 + 0.5);
}
inline uint8_t U16ToU8(uint16_t v) { return static_cast<uint8_t>((v * 255u + 32767u) / 65535u); }

} // namespace Orvane
