#pragma once
// sChangeStyle: every node of a tree with the tool's style (read per shape,
// so the style's variance applies), its shape kept by reference.
//
// Thread safety: as ShapeOperator.
#include "host/shape/ShapeOperator.h"

namespace Orvane {

class sChangeStyle : public ShapeOperator {
public:
    sChangeStyle(const Registry *reg, const ScriptVal &args, const TagList &tags);
    void Process(Request *req) override;

private:
    Input *input_;
};

} // namespace Orvane
