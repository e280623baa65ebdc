#pragma once
// DeltaKeyer: the colour-difference keyer for blue and green screens. One
// screen pass (DeltaKeyerSteps.h) takes the background off the colour and
// gives the alpha, from one background colour or per pixel from a clean
// plate; a chain of alpha passes then refines the matte and rebuilds the
// colour that the changed alpha takes away or brings back. The output is the
// premultiplied foreground. docs/DELTA_KEYER.md describes the chain, the
// views and the picking.
//
// Thread safety: inputs are made in the constructor; NotifyChanged and
// ControlCommand run on the main thread between renders, Process on the
// render thread (its steps spread rows over the workers). The pick rectangle
// is the one thing kept between them, under the picker's lock.
#include <memory>

#include "host/flow/Operator.h"
#include "operators/key/RangePicker.h"

namespace Orvane {

class Image;
class MaskInputs;
struct ImageDomain;

class DeltaKeyer : public ThreadedOperator {
public:
    DeltaKeyer(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~DeltaKeyer() override;

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    /// Widens the region asked of the image inputs by the reach of the
    /// chain's blurs. The images are fetched after the controls for it.
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    /// CCMD_Select picks the pre-matte ranges from the selected rectangle at
    /// the next render, unless Lock Color Picking is on.
    bool ControlCommand(int command, const TagList &tags) override;

private:
    struct Settings;
    bool ReadSettings(Request *req, Settings &s) const;
    /// Pixels the chain's blurs reach on each axis, for `domain`'s frame.
    static void Reach(const Settings &s, const ImageDomain *domain, int &rx, int &ry);
    Ref<Image> Key(Request *req, const Settings &s, const Image *src, const Image *clean, const Image *solid,
                   bool solidInverted, const Image *garbage, bool garbageInverted);

    Input *view_ = nullptr;
    Input *background_[3] = {}, *preBlur_ = nullptr, *gain_ = nullptr, *balance_ = nullptr;
    Input *lockReference_ = nullptr, *alphaReference_[3] = {}, *spillReference_[3] = {};
    Input *preSoft_ = nullptr, *preErode_ = nullptr, *preBlurMatte_ = nullptr;
    RangeInputs preRanges_;
    Input *resetRanges_ = nullptr;
    Input *lowThreshold_ = nullptr, *highThreshold_ = nullptr, *restoreFringe_ = nullptr, *erodeDilate_ = nullptr;
    Input *blur_ = nullptr, *cleanForeground_ = nullptr, *cleanBackground_ = nullptr;
    Input *replaceMode_ = nullptr, *replace_[3] = {};
    Input *spillMethod_ = nullptr, *spill_ = nullptr, *fringeGamma_ = nullptr, *fringeSize_ = nullptr;
    Input *fringeShape_ = nullptr, *fringeShift_[3] = {};
    Input *tuningRanges_ = nullptr, *presetSimple_ = nullptr, *presetSmooth_ = nullptr, *lockTuning_ = nullptr;
    Input *alphaGains_[3] = {}, *spillGains_[3] = {};
    Input *solidSourceAlpha_ = nullptr, *solidReplaceMode_ = nullptr, *solidReplace_[3] = {};
    Input *input_ = nullptr, *clean_ = nullptr;
    Output *output_ = nullptr;
    std::unique_ptr<MaskInputs> solid_, garbage_;
    RangePicker picker_;
};

} // namespace Orvane
