#pragma once
// GamutConvert ("Gamut"): converts images from one gamut and transfer curve to
// another: the source curve is removed, the colours are moved from the source
// primaries to the output primaries (through CIE XYZ, the white adapted by
// the Bradford method where the whites differ), and the output curve is
// applied. The three steps are one colour management transform, built and
// optimised once per set of settings.
//
// Gamuts: Rec.709 / sRGB, Rec.2020, DCI-P3 (DCI white), Display P3 (D65),
// ACES AP0, ACES AP1. Curves: Linear, sRGB, Rec.709, Gamma (a plain power,
// negative values clamp to 0), Cineon Log (code 95 black, 685 white).
//
// Thread safety: as ColorProcessorTool.
#include "operators/color/ColorProcessorTool.h"

namespace Orvane {

class GamutConvert : public ColorProcessorTool {
public:
    GamutConvert(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;

    enum Gamut : int { Rec709 = 0, Rec2020 = 1, DCIP3 = 2, DisplayP3 = 3, ACES_AP0 = 4, ACES_AP1 = 5 };
    enum Curve : int { Linear = 0, SRGB = 1, Rec709Curve = 2, Gamma = 3, CineonLog = 4 };

    /// The 3 x 3 matrix taking linear RGB of gamut `from` to linear RGB of
    /// gamut `to`, row-major.
    static void GamutMatrix(Gamut from, Gamut to, double m[3][3]);

protected:
    ColorProcessorPtr ProcessorFor(Request *req, bool *passThrough, std::string *error) override;

private:
    Input *sourceGamut_, *sourceCurve_, *sourceGamma_;
    Input *outputGamut_, *outputCurve_, *outputGamma_;
};

} // namespace Orvane
