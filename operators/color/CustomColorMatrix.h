#pragma once
// CustomColorMatrix: mixes the channels by a matrix the user types, plus an
// offset per channel:
//   out[i] = sum over j of m[i][j] * in[j] + offset[i]   (i, j: red, green, blue, alpha)
// optionally inverted, so that a second tool with the same numbers undoes the
// first. The matrix goes to the host's ApplyMatrixTagList (which also passes
// the canvas colour through it); an identity hands the input on.
//
// Thread safety: Process reads its inputs and hands the matrix to the host;
// nothing is kept between requests.
#include "host/flow/Operator.h"
#include "host/image/ColorMatrix.h"

namespace Orvane {

class CustomColorMatrix : public ThreadedOperator {
public:
    CustomColorMatrix(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

private:
    /// The matrix of this request, inverted when asked; false when it cannot be.
    bool ReadMatrix(const Request *req, ColorMatrixFull &m) const;

    Input *entry_[4][5]; ///< [output channel][input channel, then offset]
    Input *invert_;
    Input *input_;
    Output *output_;
};

} // namespace Orvane
