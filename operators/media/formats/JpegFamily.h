#pragma once
// JpegFamily: what the JPEG and IPL formats share. Both hold one libjpeg
// stream, three components for JPEG and four (RGBA) for IPL; they differ in
// the check before the header and in their save options.
#include "host/media/ImageFormat.h"
#include "operators/media/formats/JpegStream.h"

namespace Orvane {

class JpegFamily : public ImageFormat {
public:
    JpegFamily(const Registry *reg, const ScriptVal &args, const TagList &tags, bool fourComponents)
        : ImageFormat(reg, args, tags), fourComponents_(fourComponents) {}

    bool LoadHeader(IOClass *io) override;
    bool LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) override;
    bool SaveHeader(IOClass *io, Image *image) override;
    bool SaveFrame(unsigned frame, Image *image) override;

protected:
    /// A check of the stream before the header is read (the position kept).
    virtual bool AcceptsStream(IOClass *) { return true; }
    /// The save options read by SetupSave.
    virtual JpegStream::EncodeSettings SaveSettings() const = 0;

private:
    bool fourComponents_;
    int64_t start_ = 0;                  ///< stream position of the file's first byte
    int fullWidth_ = 0, fullHeight_ = 0; ///< stored size, before the proxy scale
};

} // namespace Orvane
