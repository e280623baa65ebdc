#pragma once
// ChannelBoolean: builds each output channel from the channels of two images,
// the Background and the Foreground. For each output channel the user picks a
// source (a channel of either image, its luminance, black or white), and one
// operation for all four channels combines that source S with the
// Background's own channel B:
//   Copy S, Add B + S, Subtract B - S, Multiply B * S, Divide B / S (0 where
//   S is 0), Minimum, Maximum, Difference |B - S|, Average (B + S) / 2.
// With Copy this is the channel shuffle: red from the Foreground's alpha,
// alpha from the Background's luminance, and so on. The output has the
// Background's depth and windows; an unconnected Foreground reads as
// transparent black. Beyond either image's data window its canvas colour is
// read, and the output's canvas colour is the function of the two canvases.
//
// Thread safety: Process reads its inputs and runs the rows; chunks share the
// request's values read-only and write rows of their own.
#include "host/flow/Operator.h"

namespace Orvane {

class ChannelBoolean : public ThreadedOperator {
public:
    ChannelBoolean(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

    /// Sources of an output channel, in the order of the lists.
    enum Source { RedBG, GreenBG, BlueBG, AlphaBG, RedFG, GreenFG, BlueFG, AlphaFG, Black, White, LumaBG, LumaFG };
    enum Operation { Copy, Add, Subtract, Multiply, Divide, Minimum, Maximum, Difference, Average };

private:
    Input *to_[4], *operation_;
    Input *background_, *foreground_;
    Output *output_;
};

} // namespace Orvane
