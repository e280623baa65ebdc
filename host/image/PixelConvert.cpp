#include "host/image/PixelConvert.h"

#include <algorithm>
#include <cstring>

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

namespace {

template <class T> T LoadAs(const uint8_t *p) {
    T v;
    std::memcpy(&v, p, sizeof v);
    return v;
}
template <class T> void StoreAs(uint8_t *p, T v) { std::memcpy(p, &v, sizeof v); }

float ComponentToFloat(ComponentType t, const uint8_t *p) {
    switch (t) {
    case ComponentType::Int8: return *p * (1.f / 255.f);
    case ComponentType::Int16: return LoadAs<uint16_t>(p) * (1.f / 65535.f);
    case ComponentType::Flt16: return HalfToFloat(LoadAs<uint16_t>(p));
    default: return LoadAs<float>(p);
    }
}

void FloatToComponent(ComponentType t, float v, uint8_t *p) {
    switch (t) {
    case ComponentType::Int8: *p = FloatToU8(v); break;
    case ComponentType::Int16: StoreAs<uint16_t>(p, FloatToU16(v)); break;
    case ComponentType::Flt16: StoreAs<uint16_t>(p, FloatToHalf(v)); break;
    default: StoreAs<float>(p, v); break;
    }
}

uint16_t ComponentToU16(ComponentType t, const uint8_t *p) {
    switch (t) {
    case ComponentType::Int8: return static_cast<uint16_t>(*p * 257u);
    case ComponentType::Int16: return LoadAs<uint16_t>(p);
    case ComponentType::Flt16: return FloatToU16(HalfToFloat(LoadAs<uint16_t>(p)));
    default: return FloatToU16(LoadAs<float>(p));
    }
}

void U16ToComponent(ComponentType t, uint16_t v, uint8_t *p) {
    switch (t) {
    case ComponentType::Int8: *p = U16ToU8(v); break;
    case ComponentType::Int16: StoreAs<uint16_t>(p, v); break;
    case ComponentType::Flt16: StoreAs<uint16_t>(p, FloatToHalf(v * (1.f / 65535.f))); break;
    default: StoreAs<float>(p, v * (1.f / 65535.f)); break;
    }
}

} // namespace

void LoadFlt(int depth, const uint8_t *src, int count, FltPixel *dst) {
    const PixelFormat f = FormatOfDepth(depth);
    const int bpc = f.bytesPerComponent;
    if (depth == DepthRGBAFlt32) {
        std::memcpy(dst, src, sizeof(FltPixel) * count);
        return;
    }
    for (int i = 0; i < count; ++i) {
        if (f.channels == 4) {
            const uint8_t *p = src + i * 4 * bpc;
            dst[i] = {ComponentToFloat(f.type, p), ComponentToFloat(f.type, p + bpc),
                      ComponentToFloat(f.type, p + 2 * bpc), ComponentToFloat(f.type, p + 3 * bpc)};
        } else {
            const float v = ComponentToFloat(f.type, src + i * bpc);
            dst[i] = {v, v, v, v};
        }
    }
}

void StoreFlt(int depth, const FltPixel *src, int count, uint8_t *dst) {
    const PixelFormat f = FormatOfDepth(depth);
    const int bpc = f.bytesPerComponent;
    if (depth == DepthRGBAFlt32) {
        std::memcpy(dst, src, sizeof(FltPixel) * count);
        return;
    }
    for (int i = 0; i < count; ++i) {
        if (f.channels == 4) {
            uint8_t *p = dst + i * 4 * bpc;
            FloatToComponent(f.type, src[i].R, p);
            FloatToComponent(f.type, src[i].G, p + bpc);
            FloatToComponent(f.type, src[i].B, p + 2 * bpc);
            FloatToComponent(f.type, src[i].A, p + 3 * bpc);
        } else {
            FloatToComponent(f.type, src[i].A, dst + i * bpc);
        }
    }
}

void LoadPixel(int depth, const uint8_t *src, int count, Pixel *dst) {
    const PixelFormat f = FormatOfDepth(depth);
    const int bpc = f.bytesPerComponent;
    for (int i = 0; i < count; ++i) {
        if (f.channels == 4) {
            const uint8_t *p = src + i * 4 * bpc;
            dst[i] = {ComponentToU16(f.type, p), ComponentToU16(f.type, p + bpc), ComponentToU16(f.type, p + 2 * bpc),
                      ComponentToU16(f.type, p + 3 * bpc)};
        } else {
            const uint16_t v = ComponentToU16(f.type, src + i * bpc);
            dst[i] = {v, v, v, v};
        }
    }
}

void StorePixel(int depth, const Pixel *src, int count, uint8_t *dst) {
    const PixelFormat f = FormatOfDepth(depth);
    const int bpc = f.bytesPerComponent;
    for (int i = 0; i < count; ++i) {
        if (f.channels == 4) {
            uint8_t *p = dst + i * 4 * bpc;
            U16ToComponent(f.type, src[i].R, p);
            U16ToComponent(f.type, src[i].G, p + bpc);
            U16ToComponent(f.type, src[i].B, p + 2 * bpc);
            U16ToComponent(f.type, src[i].A, p + 3 * bpc);
        } else {
            U16ToComponent(f.type, src[i].A, dst + i * bpc);
        }
    }
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
