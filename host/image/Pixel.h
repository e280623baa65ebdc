#pragma once
// Pixels and pixel formats.
//
// An image has one of eight depths: 1 to 4 are single-channel (masks) of
// int8, int16, float16 and float32; 5 to 8 are RGBA of the same component
// types. Colour is premultiplied by alpha. Integer white is 255 or 65535,
// float white 1.0, and float values may leave 0..1.
//
// FltPixel holds a pixel as four floats, Pixel as four 16-bit integers (8-bit
// data is widened by 257 so that 255 maps to 65535).
//
// A single-channel image holds its value in the alpha place: reading gives the
// value in all four channels, writing stores alpha.
#include <cstdint>
#include <string>

#include "host/core/Export.h"

namespace Orvane {

struct FltPixel {
    float R = 0.f, G = 0.f, B = 0.f, A = 0.f;
    constexpr bool operator==(const FltPixel &) const = default;
};

struct Pixel {
    uint16_t R = 0, G = 0, B = 0, A = 0;
    constexpr bool operator==(const Pixel &) const = default;
};

enum ImageDepthValue : int {
    DepthAInt8 = 1,
    DepthAInt16 = 2,
    DepthAFlt16 = 3,
    DepthAFlt32 = 4,
    DepthRGBAInt8 = 5,
    DepthRGBAInt16 = 6,
    DepthRGBAFlt16 = 7,
    DepthRGBAFlt32 = 8,
};

enum class ComponentType : uint8_t { Int8, Int16, Flt16, Flt32 };

/// What a depth stores.
struct PixelFormat {
    int depth = 0;
    int channels = 0;          ///< 1 or 4
    int bytesPerComponent = 0; ///< 1, 2 or 4
    ComponentType type = ComponentType::Int8;
    bool isFloat = false;
    int BytesPerPixel() const { return channels * bytesPerComponent; }
};

/// The format of a depth 1..8; depth 0 or out of range gives a zeroed record.
ORVANE_API PixelFormat FormatOfDepth(int depth);
/// The name users read for a component type: "int8", "int16", "float16", "float32".
ORVANE_API const char *ComponentTypeName(ComponentType type);
/// "RGBA float16", "mask int8"; "unknown" for a depth out of range.
ORVANE_API std::string DepthName(int depth);
inline bool IsValidDepth(int depth) { return depth >= 1 && depth <= 8; }
/// An image size in words for messages: "8192x4320 RGBA float32 image".
ORVANE_API std::string DescribeImage(int width, int height, int depth);

} // namespace Orvane
