#pragma once
// PNGFormat: PNG files (.png) read and written through libpng, over the
// format's stream. Files map to 8-bit RGBA (depth 5) or, at 16 bits per
// sample, 16-bit RGBA (depth 6); grey, palette and transparency chunks
// expand to RGBA, and alpha of a file without alpha is 65535.
//
// PNG holds straight colour, our images premultiplied colour: reading
// multiplies by alpha (PostMultiply), writing divides by it (PreDivide).
// An sRGB chunk reads into Metadata ColorSpace "sRGB", a gAMA chunk into
// Metadata GammaSpace (Gamma, LinearLimit 0, LinearSlope 1) and Gamma, where
// Gamma is the decoding exponent (1 / the file's gAMA value). Writing in
// GammaMode "Auto" goes back the other way.
//
// Thread safety: one object serves one clip, which serialises its use.
#include "host/media/ImageFormat.h"

namespace Orvane {

class PNGFormat : public ImageFormat {
public:
    PNGFormat(const Registry *reg, const ScriptVal &args, const TagList &tags);

    enum GammaMode { GammaAuto = 0, GammaNone = 1, GammaSRGB = 2, GammaValue = 3 };

    bool CheckFormat(IOClass *io) override;
    void AddLoadInputs(Operator *tool) override;
    void SetupLoad(Operator *tool, Request *req) override;
    void AddSaveInputs(Operator *tool) override;
    void NotifyChangedSave(Operator *tool, Input *in, Parameter *param, double time) override;
    void SetupSave(Operator *tool, Request *req) override;
    bool LoadHeader(IOClass *io) override;
    bool LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) override;
    bool SaveHeader(IOClass *io, Image *image) override;
    bool SaveFrame(unsigned frame, Image *image) override;
    int64_t PredictFileSize(Image *image) override;

private:
    int64_t start_ = 0;
    bool postMultiply_ = true;
    bool saveAlpha_ = true;
    bool preDivide_ = true;
    int depthMode_ = 0; ///< 0 auto, 1 int8, 2 int16
    int compressionLevel_ = 6;
    int gammaMode_ = GammaAuto;
    double gamma_ = 1.0;
};

} // namespace Orvane
