#pragma once
// UltraKeyer: pulls a matte from a blue or green screen in two stages, a hard
// pre-matte from colour ranges picked on the image and a soft colour-
// difference matte against the background colour, then refines the matte,
// takes the spill off, colours the fringe and hands on the foreground with
// the matte in alpha. The pixel steps are in UltraKeyerSteps.h, the refining
// stages in KeyerMatte.h; Process runs them in this order:
//
//   1. the controls and the derived values (DeriveUltraKeyerValues)
//   2. the soft matte of the source into the result (DoSoftUltraKeyer)
//   3. with a pre-matte (any range moved from 0..1): the pre-matte into a work
//      image, its alpha blurred at Pre Matte Size (Gaussian, 2 passes) and
//      levelled from 0.8 to 1, then the soft matte cut by it (DoCombine),
//      the work image keeping the soft matte; without one, when Subtract
//      Background is on, the soft matte copied to the work image
//   4. the matte blur and the levels (KeyerMatte)
//   5. with Subtract Background, the colour made to follow the refined matte
//      (DoSubtract); a solid matte does that again for the alpha it would
//      give, which step 8 applies
//   6. spill on the key channel, the fringe colour
//   7. invert
//   8. the solid and garbage mattes (an older flow's GarbageMatte link is
//      moved to Garbage.Mask as it is made), post-multiply
//   9. the source's canvas colour
// Sizes below 1.1920928955078125e-7 skip their step. The result image covers
// the region asked for grown by the blurs' reach (CheckRequest asks the
// source for it), so the blurs see past the region's edges.
//
// Picking (RangePicker.h): ControlCommand takes CCMD_Select unless Lock
// Color Picking is on; the next pixel request walks the source under the
// rectangle on the chroma axes and writes the pre-matte ranges back as one
// edit, "UltraKeyer Pick".
//
// Failure: a missing input gives no output; memory refused fails the request
// with the tool's line; an abandoned render gives no output silently.
//
// Thread safety: one request at a time (the tool's request lock); the steps
// spread rows over the workers.
#include "host/flow/Operator.h"
#include "operators/key/KeyerMatte.h"
#include "operators/key/RangePicker.h"
#include "operators/key/UltraKeyerSteps.h"

namespace Orvane {

class UltraKeyer : public ThreadedOperator {
public:
    UltraKeyer(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    bool ControlCommand(int command, const TagList &tags) override;

private:
    /// What one request keys with.
    struct Keying {
        KeyerMatte::Values matte;
        UltraKeyerValues values;
        PreMatteRanges ranges;
        double preMatteSize = 0.0;
        bool device = false; ///< the steps try their kernels first
    };
    Keying Read(Request *req);
    /// Steps 2 to 8 on `dst`, an image of the tool's own over the source;
    /// the result (dst or a widened image), null when a step failed.
    Ref<Image> Key(Request *req, const Image *src, Ref<Image> dst, const Keying &k) const;

    KeyerMatte matte_;
    RangeInputs ranges_;
    Input *background_[3], *weight_[2], *correction_, *separation_, *preMatteSize_, *reset_, *subtract_,
        *legacyGarbage_, *input_;
    Output *output_;
    RangePicker picker_;
};

} // namespace Orvane
