#pragma once
// MultiplyDivide: one class behind two tools, told apart by the class ID the
// tool was made with.
//   AlphaMultiply   red, green and blue times alpha (straight to premultiplied)
//   AlphaDivide     red, green and blue over alpha, 0 where alpha is 0
//                   (premultiplied to straight)
// Alpha itself passes unchanged; a single-channel image has no colour to
// change and is handed on. The canvas colour goes through the same function.
//
// Thread safety: Process reads its inputs and runs the rows (PointColor.h);
// nothing is kept between requests.
#include "host/flow/Operator.h"

namespace Orvane {

class MultiplyDivide : public ThreadedOperator {
public:
    MultiplyDivide(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

private:
    bool divide_; ///< made as AlphaDivide
    Input *input_;
    Output *output_;
};

} // namespace Orvane
