#pragma once
// Merge: lays a Foreground onto a Background, with rotation, scaling and
// offset. The tool is a planner around two host objects: a TransformMatrix
// built on the Background (so the Background's own pending transform
// survives to the end of the chain) and the MergeInputs group, which holds
// every placement and compositing control and does the compositing
// (docs/MERGE.md). The output is the TransformMatrix: a chain of merges and
// transforms resamples each source once.
//
// The reference size (Width, Height) is the frame the foreground is taken to
// be made for when the merge's "Scale By Reference Size" is on. With "Use
// Frame Format Settings" on it follows the document's frame format: when the
// checkbox changes (the host has no preference-change events, so a later
// change of the document's format is picked up the next time the checkbox
// is set).
//
// Thread safety: construction and NotifyChanged on the main thread; Process
// on the render thread; the compositing rows run on the workers.
#include <memory>

#include "host/flow/MergeInputs.h"
#include "host/flow/Operator.h"

namespace Orvane {

class Merge : public ThreadedOperator {
public:
    Merge(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Merge() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;

    MergeInputs *GetMergeInputs() const { return merge_.get(); }

private:
    /// Width and Height take the document's frame format when they differ.
    void FollowFrameFormat();

    Input *background_, *foreground_;
    Output *output_;
    std::unique_ptr<MergeInputs> merge_;
    Input *width_, *height_, *useFrameFormat_;
};

} // namespace Orvane
