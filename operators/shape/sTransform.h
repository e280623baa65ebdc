#pragma once
// sTransform: moves, scales and turns every node of a tree. Each top node
// (with everything under it, rigidly) is scaled by (XSize, YSize) and turned
// by ZRotation degrees about its axis moved by (XPivot, YPivot), then moved
// by (XOffset, YOffset); all seven are per-shape numbers (variance). With
// "Transform Axis" on, the node's axis goes with it, so a later transform
// turns the node about its new place; off, the axis stays where it was, so a
// later turn swings the node round its old place.
//
// Thread safety: as ShapeOperator.
#include "host/shape/ShapeOperator.h"

namespace Orvane {

class sTransform : public ShapeOperator {
public:
    sTransform(const Registry *reg, const ScriptVal &args, const TagList &tags);
    void Process(Request *req) override;

private:
    VarianceInput *xOffset_, *yOffset_, *xSize_, *ySize_, *rotation_, *xPivot_, *yPivot_;
    Input *transformAxis_, *input_;
};

} // namespace Orvane
