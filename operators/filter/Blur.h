#pragma once
// Blur: the plain image blur. The tool plans and the host blurs: it reads
// its controls, turns sizes into the normalised form (control value / 720),
// works out the source region and the output window the blur needs under the
// clipping mode, makes the output and hands the whole job to
// Image::BlurTagList (kernels in docs/BLUR.md).
//
// Windows, with reach = the blur's reach in pixels (Image::GetBlurSupport):
//   Frame   the output grows past the data window by the reach but never past
//           the frame; the source is read within the frame
//   Domain  the same with the input's domain in place of the frame
//   None    the output grows by the reach without limit, and the source is
//           read within that grown window
// Kinds without a finite reach (the recursive Gaussians) leave the output at
// the frame (the domain in pre-calculation) and ask for the whole input.
// Sizes below 2^-23 on both axes, or an input without pixels, hand the input
// itself on.
//
// Blend. The host blur mixes by the tool's Blend (the common Blend times the
// Blend on the Controls page, a plain input of the same description: the
// host has no cloned inputs), so the common mix afterwards keeps the channel
// switches and the effect mask only. With Multiply By Mask the blend has to
// follow the mask: then the host blur gets the Controls page's Blend alone
// and the common mix applies the common one.
//
// Thread safety: one request at a time (the tool's request lock); the host
// call runs rows on the worker pool.
#include "host/flow/Operator.h"

namespace Orvane {

class Blur : public ThreadedOperator {
public:
    Blur(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    void PostProcess(Request *req) override;

    /// The BlurTypes value of a filter ID; IDs outside the table ("Soften"
    /// among them) give the fallback kernel, 1.
    static int FilterType(OvID id);

private:
    /// Normalised sizes and passes as the controls give them.
    struct Sizes {
        double x = 0.0, y = 0.0;
        int passes = 1;
    };
    Sizes ReadSizes(Request *req) const;
    /// An input's value for this request (BlurControls.h), else its default.
    double AskNumber(Request *req, Input *in) const;
    OvID AskID(Request *req, Input *in) const;

    Input *filter_, *channel_[4], *lockXY_, *xSize_, *ySize_, *passes_, *clipping_, *blendClone_, *input_;
    Output *output_;
};

} // namespace Orvane
