#pragma once
// PixPtr: a cursor over the pixels of one image row that hides the depth.
// Get/Put convert through FltPixel (floats) or Pixel (16-bit integers), so
// code that is not on a hot path can treat every depth alike; hot loops
// choose their pixel type once per call and use Image::Row<T> instead.
//
//   PixPtr p(img, x0, y);
//   for (int x = x0; x < x1; ++x, ++p) { FltPixel f = p.GetFlt(); ...; p.PutFlt(f); }
//
// Thread safety: a cursor belongs to one thread; cursors on different rows
// of one image may run at once.
#include <cstdint>

#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {

class PixPtr {
public:
    PixPtr() = default;
    /// A cursor at (x, y); invalid (null) when the pixel is outside the data
    /// window or the image has no rows.
    PixPtr(const Image *img, int x, int y)
        : p_(img ? img->PixelAddress(x, y) : nullptr), depth_(img ? img->Depth() : 0),
          step_(img ? img->BytesPerPixel() : 0) {}

    explicit operator bool() const { return p_ != nullptr; }
    PixPtr &operator++() {
        p_ += step_;
        return *this;
    }
    PixPtr &operator+=(int n) {
        p_ += static_cast<ptrdiff_t>(n) * step_;
        return *this;
    }

    FltPixel GetFlt() const {
        FltPixel f;
        LoadFlt(depth_, p_, 1, &f);
        return f;
    }
    void PutFlt(const FltPixel &f) const { StoreFlt(depth_, &f, 1, p_); }
    Pixel GetPixel() const {
        Pixel px;
        LoadPixel(depth_, p_, 1, &px);
        return px;
    }
    void PutPixel(const Pixel &px) const { StorePixel(depth_, &px, 1, p_); }
    uint8_t *Address() const { return p_; }

private:
    uint8_t *p_ = nullptr;
    int depth_ = 0, step_ = 0;
};

} // namespace Orvane
