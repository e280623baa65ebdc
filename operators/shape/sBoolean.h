#pragma once
// sBoolean: the intersection, union, difference or exclusive or of two shape
// trees, through the polygon adaptor (host/shape/ShapeClip.h) with the
// non-zero rule. "Replace" (and any "Union") makes one node of the whole
// result, styled by the tool; "Keep" clips node by node and keeps each node's
// style: a node of Input1 meets only the nodes of Input2 whose bounds overlap
// it, one node per worker. "Xor" in "Keep" is the two differences, each way.
// With one input the tree is handed on, restyled under "Replace".
//
// Thread safety: as ShapeOperator; the node workers each have their own
// clipper and paths.
#include "host/shape/ShapeOperator.h"

namespace Orvane {

class sBoolean : public ShapeOperator {
public:
    sBoolean(const Registry *reg, const ScriptVal &args, const TagList &tags);
    void Process(Request *req) override;

private:
    Input *operation_, *styleMode_, *input1_, *input2_;
};

} // namespace Orvane
