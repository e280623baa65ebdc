#pragma once
// Rows of an image as the 8-bit writers need them: row y of the frame (0 to
// width) in 16-bit units, the canvas colour where the data window does not
// reach, and packed into blue, green, red (and alpha) bytes.
#include <cstdint>
#include <vector>

#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane::FrameRows {

/// Frame row y as 16-bit pixels; `flt` is scratch for rows the window does not cover.
inline void Row16(const Image &img, int y, int width, std::vector<Pixel> &out, std::vector<FltPixel> &flt) {
    out.resize(static_cast<size_t>(width));
    const ImgRectI &dw = img.DataWindow();
    const uint8_t *row = img.ScanLine(y);
    if (row && dw.x0 <= 0 && dw.x1 >= width) {
        LoadPixel(img.Depth(), row + static_cast<size_t>(-dw.x0) * img.BytesPerPixel(), width, out.data());
        return;
    }
    flt.resize(static_cast<size_t>(width));
    ReadSpanFlt(img, y, 0, width, flt.data());
    for (int x = 0; x < width; ++x) out[x] = FltToPixel(flt[x]);
}

/// Packs 16-bit pixels as 8-bit blue, green, red and, with `alpha`, alpha.
inline void PackBGRA8(const std::vector<Pixel> &px, int width, bool alpha, uint8_t *out) {
    const int bpp = alpha ? 4 : 3;
    for (int x = 0; x < width; ++x) {
        uint8_t *d = out + static_cast<size_t>(x) * bpp;
        d[0] = static_cast<uint8_t>(px[x].B >> 8), d[1] = static_cast<uint8_t>(px[x].G >> 8);
        d[2] = static_cast<uint8_t>(px[x].R >> 8);
        if (alpha) d[3] = static_cast<uint8_t>(px[x].A >> 8);
    }
}

} // namespace Orvane::FrameRows
