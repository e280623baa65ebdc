#pragma once
// WhiteBalance: removes a colour cast by scaling three channels so that one
// white becomes another, either in RGB itself or in a cone response space
// (Bradford) reached through CIE XYZ of linear Rec. 709. The white to remove
// is a picked colour, which becomes the grey of equal luminance, or the white
// of a colour temperature and tint, which becomes the white of the target
// temperature and tint (docs/COLOR_GAIN.md has the conversion). The result is
// one 3 x 3 matrix, run by the host (RunGainMatrix); Reverse runs its inverse,
// so a second instance with the same settings undoes the first. Alpha is left
// as it is.
//
// Thread safety: Process runs on the tool's render thread only; the matrix is
// a local of each request.
#include "host/flow/Operator.h"
#include "host/image/ColorMatrix.h"

namespace Orvane {

class WhiteBalance : public ThreadedOperator {
public:
    WhiteBalance(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~WhiteBalance() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;

    /// CIE 1931 xy of the white of a colour temperature in kelvin (1667 to
    /// 25000, on the Planckian locus) moved by `tint` thousandths of CIE 1960
    /// uv across the locus, toward green for positive values.
    static void TemperatureWhite(double kelvin, double tint, double &x, double &y);

private:
    Input *method_, *space_, *neutral_[3], *temperature_, *tint_, *targetTemperature_, *targetTint_, *direction_;
    Input *input_;
    Output *output_;
};

} // namespace Orvane
