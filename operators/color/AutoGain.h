#pragma once
// AutoGain: measures the lowest and highest values of the input's pixels in
// each frame and stretches them linearly to the chosen Low and High
// (docs/COLOR_GAIN.md). Red, green and blue are measured together, so that
// hues keep their balance, or each on its own; a mask's one channel is its
// own. The measurement covers the whole data window of the input, whatever
// region is asked for, so a region is always the same part of the whole
// frame; rows are measured in parallel and the minimum and maximum do not
// depend on the order, so any number of workers gives the same result. The
// stretch is one matrix, run by the host (RunGainMatrix).
//
// Thread safety: Process runs on the tool's render thread only; the row
// chunks write their own entries of a local table.
#include "host/flow/Operator.h"

namespace Orvane {

class AutoGain : public ThreadedOperator {
public:
    AutoGain(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~AutoGain() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void CheckRequest(Request *req) override;
    void Process(Request *req) override;

private:
    Input *low_, *high_, *channels_;
    Input *input_;
    Output *output_;
};

} // namespace Orvane
