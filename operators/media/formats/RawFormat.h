#pragma once
// RawFormat: this system's own image file (".raw"): a frame as it stands in
// memory, with everything an Image holds: depth, data and valid windows,
// aspect, canvas colour, attributes, auxiliary channels and Metadata.
//
// Layout (little-endian): a fixed header of 712 bytes, the canvas colour (one
// main pixel and one auxiliary pixel), the Metadata block (zlib level 5 of its
// script text), the tag block (the image's attributes), padding to a multiple
// of 512, then the pixels: the lines of the data window, main plane first,
// then the auxiliary plane (the image's auxiliary channels interleaved as
// 32-bit floats). Pixels are stored plain, as zlib lines (level 1, each
// preceded by its compressed size) or run-length coded by whole pixels
// (auxiliary lines stay zlib). See RawFormat.cpp for the header fields.
//
// Option: Compression (None, Zlib, Runlength; default Runlength).
//
// Thread safety: one object serves one clip, which serialises its use.
#include <cstdint>
#include <vector>

#include "host/media/ImageFormat.h"

namespace Orvane {

class RawFormat : public ImageFormat {
public:
    using ImageFormat::ImageFormat;

    enum Compression : int { CompressNone = 0, CompressZlib = 1, CompressRunLength = 2 };
    static constexpr int kHeaderSize = 712;
    static constexpr int kSlots = 64;
    /// Slots 0..3 hold R, G, B, A of the main pixel (a mask uses slot 3 only);
    /// slot kFirstAuxSlot + k holds auxiliary channel k (AuxChannelKind order).
    static constexpr int kFirstAuxSlot = 4;

    bool CheckFormat(IOClass *io) override;
    void AddSaveInputs(Operator *tool) override;
    void SetupSave(Operator *tool, Request *req) override;
    void CleanupSave(Operator *tool) override;

    bool LoadHeader(IOClass *io) override;
    bool LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) override;
    bool SaveHeader(IOClass *io, Image *image) override;
    bool SaveFrame(unsigned frame, Image *image) override;
    int64_t PredictFileSize(Image *image) override;

    /// Run-length codes `count` elements of `elementBytes` bytes (1, 2, 4, 8
    /// or 16) into `out`; returns the bytes written. `out` needs room for
    /// count * (elementBytes + 1) bytes.
    static size_t EncodeRunLength(const uint8_t *src, int count, int elementBytes, uint8_t *out);

private:
    struct Layout {
        int mainPix = 0, auxPix = 0;
        int64_t mainLine = 0, auxLine = 0;
        ImgRectI window, valid;
        std::vector<AuxChannelKind> aux;
        int16_t auxOffset[kSlots];
    };
    bool ReadPixels(Image &image, const ImgRectI &want);

    // Read side.
    uint8_t hdr_[kHeaderSize] = {};
    Layout in_;
    int compression_ = 0;
    int64_t dataOffset_ = 0, dataSize_ = 0, tagOffset_ = 0, tagEnd_ = 0, canvasOffset_ = 0;
    // Write side.
    Layout out_;
    int saveCompression_ = CompressRunLength;
    int64_t headerPos_ = 0;
};

} // namespace Orvane
