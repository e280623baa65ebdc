#pragma once
// PolyMask: a mask drawn from an animated polyline, in two registrations that
// share this class: "PolylineMask" (Bezier points) and "BSplineMask" (its
// Polyline inputs hold B-spline control points). Its own inputs follow the
// common mask controls: Center, Size, XRotation, YRotation, ZRotation,
// FillMethod, TrackerSearchSize, Polyline, and Polyline2, the outer line of
// a soft band (hidden until it holds a point or is linked). PolyMaskInputs
// holds them and draws.
//
// The document keys of the viewer's edit state (DrawMode, DrawMode2,
// DrawStyle2, the colours, the Show switches, StopRendering,
// FollowExtMatchPoints, PolyLine2Disabled, OnionSkinning, RotoAssist and
// their outer-line forms) are kept as the document gave them and written back
// unchanged (Operator::KeptFields); they change nothing here.
//
// Thread safety: as MaskOperator.
#include <memory>

#include "host/flow/MaskOperator.h"
#include "operators/mask/PolyMaskInputs.h"

namespace Orvane {

class PolyMask : public MaskOperator {
public:
    PolyMask(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void PreProcess(Request *req) override;
    void Process(Request *req) override;

private:
    std::unique_ptr<PolyMaskInputs> poly_;
};

} // namespace Orvane
