#pragma once
// sMerge: the trees of its inputs in one, drawn in input order, their top
// nodes taken by reference (no copies). The inputs grow as they are linked:
// there is always one more "Input<n>" than the last linked one. "Override
// Axis" gives every merged node the centre of the whole merged tree as its
// axis, so that a transform after it turns the group as one.
//
// Thread safety: as ShapeOperator; inputs are added from NotifyChanged on the
// main thread.
#include <vector>

#include "host/shape/ShapeOperator.h"

namespace Orvane {

class sMerge : public ShapeOperator {
public:
    sMerge(const Registry *reg, const ScriptVal &args, const TagList &tags);
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;

private:
    Input *overrideAxis_;
    std::vector<Input *> inputs_;
};

} // namespace Orvane
