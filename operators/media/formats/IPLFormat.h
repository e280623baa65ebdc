#pragma once
// IPLFormat: IPL files (.ipl), JPEG streams of four components that hold
// R, G, B and A as they stand (written untransformed behind an Adobe marker).
// Reading checks the first 16 bytes (SOI, then a JFIF APP0 or an Adobe
// APP14) and refuses streams of any other component count.
// Save option: Quality (0..100, the libjpeg quality).
//
// Thread safety: one object serves one clip, which serialises its use.
#include "operators/media/formats/JpegFamily.h"

namespace Orvane {

class IPLFormat : public JpegFamily {
public:
    IPLFormat(const Registry *reg, const ScriptVal &args, const TagList &tags);

    bool CheckFormat(IOClass *io) override;
    void AddSaveInputs(Operator *tool) override;
    void SetupSave(Operator *tool, Request *req) override;
    int64_t PredictFileSize(Image *image) override;

protected:
    bool AcceptsStream(IOClass *io) override { return CheckMarkers(io); }
    JpegStream::EncodeSettings SaveSettings() const override;

private:
    /// True when the 16 bytes at the stream's position start an IPL file;
    /// the position is kept.
    bool CheckMarkers(IOClass *io);
    int quality_ = 93;
};

} // namespace Orvane
