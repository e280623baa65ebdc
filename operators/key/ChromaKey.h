#pragma once
// ChromaKey: keys a uniform coloured background by a box of colour ranges.
// Each pixel is placed on four axes, red, green, blue and luminance (the
// chroma axes of KeyFunctions.h with Key Type "Chroma", plain colour with
// "Color"); inside the box of the four ranges, ends included, alpha is 0,
// beyond it alpha rises over the Soft Range to 1. While every range stands
// at its default (0 to 1) nothing has been chosen to key, and the matte is
// solid (DoSolidAlpha). The refining chain follows, with spill and fringe.
//
// Picking (RangePicker.h): ControlCommand takes CCMD_Select unless Lock
// Color Picking is on; the next pixel request walks the source under the
// rectangle on the Key Type's axes and writes the ranges back as one edit,
// "ChromaKeyer Pick".
//
// Thread safety: as SimpleKeyer; ControlCommand runs on the main thread.
#include "operators/key/KeyFunctions.h"
#include "operators/key/RangePicker.h"
#include "operators/key/SimpleKeyer.h"

namespace Orvane {

class ChromaKey : public SimpleKeyer {
public:
    ChromaKey(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;
    bool ControlCommand(int command, const TagList &tags) override;

    /// The first matte: `src`'s colour, the range key in alpha (device or rows).
    bool DoChromaKey(Request *req, const Image *src, Image *dst);
    /// `src`'s colour with alpha 1, the canvas likewise.
    bool DoSolidAlpha(Request *req, const Image *src, Image *dst);

protected:
    bool ReadKey(Request *req, KeyerMatte::Values &v) override;
    bool FirstMatte(Request *req, const Image *src, Image *dst) override;

private:
    bool RunDevice(Request *req, const Image *src, Image *dst) const;

    ChromaKeyRanges ranges_;
    bool solid_ = true; ///< every range at its default
    RangeInputs rangeInputs_;
    Input *keyType_, *soft_, *reset_;
    RangePicker picker_;
};

} // namespace Orvane
