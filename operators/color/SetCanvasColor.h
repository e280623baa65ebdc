#pragma once
// SetCanvasColor: gives an image a new canvas colour, the colour of
// everything beyond its data window, and leaves its pixels as they are. Where
// a clipping mode widens the output past the input's data window, the widened
// part takes the new colour too. The colour is stored as given: premultiplied
// like every colour in an image.
//
// Thread safety: Process reads its inputs and runs the rows; nothing is kept
// between requests.
#include "host/flow/Operator.h"

namespace Orvane {

class SetCanvasColor : public ThreadedOperator {
public:
    SetCanvasColor(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

private:
    Input *color_[4];
    Input *input_;
    Output *output_;
};

} // namespace Orvane
