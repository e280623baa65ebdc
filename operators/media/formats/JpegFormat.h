#pragma once
// JpegFormat: JPEG files (.jpg, .jpeg) read and written through libjpeg.
// Reading decodes to 8-bit RGBA (alpha 65535), at 1 / proxy scale through
// libjpeg's own scaling, only the rows of the requested region; an ICC
// profile's description fills the image's Metadata colour space. Files of
// four components belong to IPLFormat and are refused here.
// Save options: Quality, ChromaSubsampling, SetCustomResolution, ResolutionDPI.
//
// Thread safety: one object serves one clip, which serialises its use.
#include "operators/media/formats/JpegFamily.h"

namespace Orvane {

class JpegFormat : public JpegFamily {
public:
    JpegFormat(const Registry *reg, const ScriptVal &args, const TagList &tags);

    bool CheckFormat(IOClass *io) override;
    void AddSaveInputs(Operator *tool) override;
    void NotifyChangedSave(Operator *tool, Input *in, Parameter *param, double time) override;
    void SetupSave(Operator *tool, Request *req) override;
    int64_t PredictFileSize(Image *image) override;

protected:
    JpegStream::EncodeSettings SaveSettings() const override;

private:
    int quality_ = 97;
    bool chromaSubsampling_ = false;
    int dpi_ = 0; ///< 0: no custom resolution
};

} // namespace Orvane
