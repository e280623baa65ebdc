#include "host/image/PixelConvert.h"

#include <algorithm>
#include <cstring>
#include <type_traits>

#include "host/image/Half.h"
#include "host/image/Image.h"

namespace Orvane {

PixelFormat FormatOfDepth(int depth) {
    PixelFormat f;
    if (!IsValidDepth(depth)) return f;
    f.depth = depth;
    f.channels = depth >= DepthRGBAInt8 ? 4 : 1;
    switch ((depth - 1) % 4) {
    case 0: f.type = ComponentType::Int8, f.bytesPerComponent = 1; break;
    case 1: f.type = ComponentType::Int16, f.bytesPerComponent = 2; break;
    case 2: f.type = ComponentType::Flt16, f.bytesPerComponent = 2, f.isFloat = true; break;
    default: f.type = ComponentType::Flt32, f.bytesPerComponent = 4, f.isFloat = true; break;
    }
    return f;
}

const char *ComponentTypeName(ComponentType type) {
    switch (type) {
    case ComponentType::Int8: return "int8";
    case ComponentType::Int16: return "int16";
    case ComponentType::Flt16: return "float16";
    case ComponentType::Flt32: break;
    }
    return "float32";
}

std::string DepthName(int depth) {
    if (!IsValidDepth(depth)) return "unknown";
    const PixelFormat f = FormatOfDepth(depth);
    return std::string(f.channels == 1 ? "mask " : "RGBA ") + ComponentTypeName(f.type);
}

std::string DescribeImage(int width, int height, int depth) {
    return std::to_string(width) + "x" + std::to_string(height) + " " + DepthName(depth) + " image";
}

namespace {

template <class T> T LoadAs(const uint8_t *p) {
    T v;
    std::memcpy(&v, p, sizeof v);
    return v;
}
template <class T> void StoreAs(uint8_t *p, T v) { std::memcpy(p, &v, sizeof v); }

inline float ComponentToFloat(ComponentType t, const uint8_t *p) {
    switch (t) {
    case ComponentType::Int8: return *p * (1.f / 255.f);
    case ComponentType::Int16: return LoadAs<uint16_t>(p) * (1.f / 65535.f);
    case ComponentType::Flt16: return HalfToFloat(LoadAs<uint16_t>(p));
    default: return LoadAs<float>(p);
    }
}

inline void FloatToComponent(ComponentType t, float v, uint8_t *p) {
    switch (t) {
    case ComponentType::Int8: *p = FloatToU8(v); break;
    case ComponentType::Int16: StoreAs<uint16_t>(p, FloatToU16(v)); break;
    case ComponentType::Flt16: StoreAs<uint16_t>(p, FloatToHalf(v)); break;
    default: StoreAs<float>(p, v); break;
    }
}

inline uint16_t ComponentToU16(ComponentType t, const uint8_t *p) {
    switch (t) {
    case ComponentType::Int8: return static_cast<uint16_t>(*p * 257u);
    case ComponentType::Int16: return LoadAs<uint16_t>(p);
    case ComponentType::Flt16: return FloatToU16(HalfToFloat(LoadAs<uint16_t>(p)));
    default: return FloatToU16(LoadAs<float>(p));
    }
}

inline void U16ToComponent(ComponentType t, uint16_t v, uint8_t *p) {
    switch (t) {
    case ComponentType::Int8: *p = U16ToU8(v); break;
    case ComponentType::Int16: StoreAs<uint16_t>(p, v); break;
    case ComponentType::Flt16: StoreAs<uint16_t>(p, FloatToHalf(v * (1.f / 65535.f))); break;
    default: StoreAs<float>(p, v * (1.f / 65535.f)); break;
    }
}

} // namespace

namespace {

/// Calls fn with the component type as a compile-time constant, so the
/// per-pixel loops below are instantiated once per type and the switch runs
/// once per call.
template <class Fn> void WithType(ComponentType t, Fn &&fn) {
    switch (t) {
    case ComponentType::Int8: fn(std::integral_constant<ComponentType, ComponentType::Int8>()); break;
    case ComponentType::Int16: fn(std::integral_constant<ComponentType, ComponentType::Int16>()); break;
    case ComponentType::Flt16: fn(std::integral_constant<ComponentType, ComponentType::Flt16>()); break;
    default: fn(std::integral_constant<ComponentType, ComponentType::Flt32>()); break;
    }
}

/// Reads `count` stored pixels into four-channel pixels through `get`
/// (component address to channel value); single channels fill all four.
template <class Px, class Get> void LoadRun(const PixelFormat &f, const uint8_t *src, int count, Px *dst, Get get) {
    const int bpc = f.bytesPerComponent;
    if (f.channels == 4) {
        for (int i = 0; i < count; ++i, src += 4 * bpc)
            dst[i] = {get(src), get(src + bpc), get(src + 2 * bpc), get(src + 3 * bpc)};
    } else {
        for (int i = 0; i < count; ++i, src += bpc) {
            const auto v = get(src);
            dst[i] = {v, v, v, v};
        }
    }
}

/// Writes `count` four-channel pixels through `put` (value, component
/// address); single channels store alpha.
template <class Px, class Put> void StoreRun(const PixelFormat &f, const Px *src, int count, uint8_t *dst, Put put) {
    const int bpc = f.bytesPerComponent;
    if (f.channels == 4) {
        for (int i = 0; i < count; ++i, dst += 4 * bpc) {
            put(src[i].R, dst);
            put(src[i].G, dst + bpc);
            put(src[i].B, dst + 2 * bpc);
            put(src[i].A, dst + 3 * bpc);
        }
    } else {
        for (int i = 0; i < count; ++i, dst += bpc) put(src[i].A, dst);
    }
}

} // namespace

void LoadFlt(int depth, const uint8_t *src, int count, FltPixel *dst) {
    if (depth == DepthRGBAFlt32) {
        std::memcpy(dst, src, sizeof(FltPixel) * count);
        return;
    }
    const PixelFormat f = FormatOfDepth(depth);
    WithType(f.type, [&](auto t) {
        LoadRun(f, src, count, dst, [](const uint8_t *p) { return ComponentToFloat(decltype(t)::value, p); });
    });
}

void StoreFlt(int depth, const FltPixel *src, int count, uint8_t *dst) {
    if (depth == DepthRGBAFlt32) {
        std::memcpy(dst, src, sizeof(FltPixel) * count);
        return;
    }
    const PixelFormat f = FormatOfDepth(depth);
    WithType(f.type, [&](auto t) {
        StoreRun(f, src, count, dst, [](float v, uint8_t *p) { FloatToComponent(decltype(t)::value, v, p); });
    });
}

namespace {
/// Bytes of one component, at compile time.
constexpr int ComponentBytes(ComponentType t) {
    return t == ComponentType::Int8 ? 1 : t == ComponentType::Flt32 ? 4 : 2;
}
} // namespace

void LoadMaskFlt(int depth, const uint8_t *src, int count, float *dst) {
    if (depth == DepthAFlt32) {
        std::memcpy(dst, src, sizeof(float) * count);
        return;
    }
    WithType(FormatOfDepth(depth).type, [&](auto t) {
        constexpr ComponentType type = decltype(t)::value;
        for (int i = 0; i < count; ++i) dst[i] = ComponentToFloat(type, src + i * ComponentBytes(type));
    });
}

void StoreMaskFlt(int depth, const float *src, int count, uint8_t *dst) {
    if (depth == DepthAFlt32) {
        std::memcpy(dst, src, sizeof(float) * count);
        return;
    }
    WithType(FormatOfDepth(depth).type, [&](auto t) {
        constexpr ComponentType type = decltype(t)::value;
        for (int i = 0; i < count; ++i) FloatToComponent(type, src[i], dst + i * ComponentBytes(type));
    });
}

void LoadPixel(int depth, const uint8_t *src, int count, Pixel *dst) {
    const PixelFormat f = FormatOfDepth(depth);
    WithType(f.type, [&](auto t) {
        LoadRun(f, src, count, dst, [](const uint8_t *p) { return ComponentToU16(decltype(t)::value, p); });
    });
}

void StorePixel(int depth, const Pixel *src, int count, uint8_t *dst) {
    const PixelFormat f = FormatOfDepth(depth);
    WithType(f.type, [&](auto t) {
        StoreRun(f, src, count, dst, [](uint16_t v, uint8_t *p) { U16ToComponent(decltype(t)::value, v, p); });
    });
}

Pixel FltToPixel(const FltPixel &f) { return {FloatToU16(f.R), FloatToU16(f.G), FloatToU16(f.B), FloatToU16(f.A)}; }

FltPixel PixelToFlt(const Pixel &p) {
    constexpr float k = 1.f / 65535.f;
    return {p.R * k, p.G * k, p.B * k, p.A * k};
}

void ReadSpanFlt(const Image &img, int y, int x0, int x1, FltPixel *dst) {
    if (x1 <= x0) return;
    const ImgRectI &dw = img.DataWindow();
    const FltPixel canvas = img.GetCanvasColor();
    const uint8_t *row = img.ScanLine(y);
    if (!row || x1 <= dw.x0 || x0 >= dw.x1) {
        std::fill(dst, dst + (x1 - x0), canvas);
        return;
    }
    const int left = std::max(x0, dw.x0), right = std::min(x1, dw.x1);
    std::fill(dst, dst + (left - x0), canvas);
    LoadFlt(img.Depth(), row + static_cast<size_t>(left - dw.x0) * img.BytesPerPixel(), right - left,
            dst + (left - x0));
    std::fill(dst + (right - x0), dst + (x1 - x0), canvas);
}

} // namespace Orvane
