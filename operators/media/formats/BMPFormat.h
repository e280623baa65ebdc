#pragma once
// BMPFormat: Windows bitmap files (".bmp", ".dib"), read and written by this
// library's own code.
//
// Reading takes uncompressed files of 8 bits (through the palette), 24 and
// 32 bits, with the 40-byte info header or the 12-byte header of the older
// OS/2 layout (larger info headers are read for their first 40 bytes), stored
// bottom line first or, with a negative height, top line first.
// Compression must be none or bit fields; bit fields are read as blue,
// green, red, alpha bytes. Only the rows and columns of the requested region
// are decoded.
//
// Writing makes 24-bit files, or 32-bit ones with alpha (option SaveAlpha).
// Pixels come out as the top 8 bits of their 16-bit value.
//
// Thread safety: one object serves one clip, which serialises its use.
#include <cstdint>
#include <vector>

#include "host/media/ImageFormat.h"

namespace Orvane {

class BMPFormat : public ImageFormat {
public:
    using ImageFormat::ImageFormat;

    bool CheckFormat(IOClass *io) override;
    void AddSaveInputs(Operator *tool) override;
    void SetupSave(Operator *tool, Request *req) override;
    void CleanupSave(Operator *tool) override;

    bool LoadHeader(IOClass *io) override;
    bool LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) override;
    bool SaveHeader(IOClass *io, Image *image) override;
    bool SaveFrame(unsigned frame, Image *image) override;
    int64_t PredictFileSize(Image *image) override;

    /// Bytes of one stored line: 8 bits (width + 3) & ~3, 24 bits
    /// ((width + 1) * 3) & ~3, 32 bits width * 4.
    static int64_t Stride(int bits, int width);

private:
    int bits_ = 0;
    bool topDown_ = false;         ///< lines stored top first (negative height)
    int64_t dataStart_ = 0;        ///< stream position of the bottom line
    std::vector<uint8_t> palette_; ///< 4 bytes an entry: blue, green, red, unused
    bool saveAlpha_ = true;
};

} // namespace Orvane
