#pragma once
// CineonLog: converts red, green and blue between the printing-density log
// encoding of film scans and linear light, either way, over the curve that
// the Loader and Saver use (host/color/Gamut.h): black and white code values
// (of 1023), the film gamma, and an optional soft clip that rolls highlights
// off toward 1 when going to linear. Alpha passes unchanged; values are
// converted as stored (premultiplied). Float rows go through the host's row
// functions; integer images read their codes from a table made once per
// request. The canvas colour goes through the same curve.
//
// Thread safety: Process reads its inputs, fills its table and runs the
// rows; chunks only read the table.
#include <vector>

#include "host/color/Gamut.h"
#include "host/flow/Operator.h"

namespace Orvane {

class CineonLog : public ThreadedOperator {
public:
    CineonLog(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

private:
    Input *mode_, *black_, *white_, *filmGamma_, *softClip_;
    Input *input_;
    Output *output_;
};

} // namespace Orvane
