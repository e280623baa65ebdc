#include "operators/mask/EllipseMask.h"

#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<EllipseMask, MaskOperator>
    s_Registration(OvID("EllipseMask"), &CLSID_MaskOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindMask},
                    {RegClassName, "EllipseMask"},
                    {RegPath, "Tools/Masks/Ellipse"},
                    {RegName, "Ellipse"},
                    {RegCategory, "Mask"},
                    {RegAbbreviation, "Elp"},
                    {RegHelp, "Creates an elliptical mask"},
                    {RegIcon, "Icons.Tools.Icons.EllipseMask"},
                    {RegMaskName, "Ellipse Mask"},
                    {RegMaskHasSize, 1},
                    {RegOutputType, "Mask"},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

EllipseMask::EllipseMask(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : PrimitiveMask(reg, args, tags) {
    AddCenterAndSize(true);
    AddAngle();
}

bool EllipseMask::InvertOf(Request *req) const { return maskgeo::InvertOn(req->GetInputNumber(InInvert()), true); }

PrimitiveMask::Outline EllipseMask::BuildShape(Request *req, const Space &s, bool forBox) const {
    const double hw = HalfWidth(req), hh = HalfHeight(req);
    const double b = maskgeo::EllipseBorder(req->GetInputNumber(InBorderWidth()), hw, hh);
    Outline out;
    out.points = maskgeo::EllipsePoints(hw, hh, b, PlacementOf(req, s, hw, hh), s.width);
    if (out.points.empty()) return out; // no size: nothing to draw
    Ref<Shape> base = MakeRef<Shape>();
    AddPolygon(*base, out.points);
    // The ellipse always joins round: its points are all smooth.
    Finish(req, s, base, b, ShapeJoinRound, false, forBox, out);
    return out;
}

} // namespace Orvane
