#pragma once
// TargaFormat: Targa files (".tga"), read and written by this library's own
// code.
//
// Reading takes image types 1, 2, 3 (colour-mapped, true colour, grey) and
// their run-length forms 9, 10, 11, at 8, 16, 24 or 32 bits a pixel, with
// either origin (a top-origin file is turned over, a right-to-left one
// mirrored). A plain file honours the proxy scale by taking every n-th pixel
// of every n-th line; a run-length file is always read whole (proxy scale 1).
//
// Writing makes 24-bit files, or 32-bit with alpha (option SaveAlpha), run-
// length coded per line (option Compress) or plain, bottom line first.
//
// Thread safety: one object serves one clip, which serialises its use.
#include <cstdint>
#include <vector>

#include "host/media/ImageFormat.h"

namespace Orvane {

class TargaFormat : public ImageFormat {
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

    /// Run-length codes `count` pixels of `bytesPerPixel` bytes into `out`
    /// (packets of at most 128 pixels); returns the bytes written, at most
    /// count * bytesPerPixel + (count + 127) / 128.
    static size_t EncodeLine(const uint8_t *pixels, int count, int bytesPerPixel, uint8_t *out);

private:
    bool ReadPlain(Image &image, const ImgRectI &win);
    bool ReadRunLength(Image &image, const ImgRectI &win);
    /// One pixel of the file as 16-bit RGBA.
    Pixel Decode(const uint8_t *s) const;

    int type_ = 0, bits_ = 0, descriptor_ = 0;
    int fullWidth_ = 0, fullHeight_ = 0, scale_ = 1;
    int mapFirst_ = 0;
    int64_t dataStart_ = 0;
    std::vector<Pixel> map_;
    bool saveAlpha_ = true, compress_ = true;
};

} // namespace Orvane
