#include "operators/mask/RectangleMask.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<RectangleMask, MaskOperator>
    s_Registration(OvID("RectangleMask"), &CLSID_MaskOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindMask},
                    {RegClassName, "RectangleMask"},
                    {RegPath, "Tools/Masks/Rectangle"},
                    {RegName, "Rectangle"},
                    {RegCategory, "Mask"},
                    {RegAbbreviation, "Rct"},
                    {RegHelp, "Creates a rectangular mask"},
                    {RegIcon, "Icons.Tools.Icons.RectangleMask"},
                    {RegMaskName, "Rectangle Mask"},
                    {RegMaskHasPolygon, 1},
                    {RegMaskHasSize, 1},
                    {RegOutputType, "Mask"},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

RectangleMask::RectangleMask(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : PrimitiveMask(reg, args, tags) {
    AddCenterAndSize(false);
    cornerRadius_ = AddInputTagList("Corner Radius", "CornerRadius",
                                    {{LinkDataType, CLSID_DataType_Number},
                                     {InputControl, CLSID_InputControl_Slider},
                                     {PreviewControl, CLSID_PreviewControl_Rectangle},
                                     {InputDefault, 0.0},
                                     {InputMinAllowed, 0.0},
                                     {InputMaxAllowed, 1.0}});
    AddAngle();
}

PrimitiveMask::Outline RectangleMask::BuildShape(Request *req, const Space &s, bool forBox) const {
    const double hw = HalfWidth(req), hh = HalfHeight(req), corner = req->GetInputNumber(cornerRadius_);
    const double b = req->GetInputNumber(InBorderWidth());
    const bool solid = req->GetInputNumber(InSolid(), 1.0) >= 0.5;
    const int join = maskgeo::JoinOfButton(req->GetInputNumber(InJoinStyle()));
    const maskgeo::Placement place = PlacementOf(req, s, 1.0, 1.0);
    Outline out;
    // A hollow rectangle with a negative border draws nothing.
    if (!(hw > 0.0 && hh > 0.0 && (solid || b >= 0.0))) return out;

    const bool miter = join == ShapeJoinMiter || join == ShapeJoinMiterClip;
    if (b != 0.0 && (!miter || (!solid && !WriteOnOf(req).Whole()))) {
        // Through the Shape service: the border rounds or bevels the corners as the join says.
        out.points = maskgeo::RectanglePoints(hw, hh, corner, 0.0, place, s.width);
        Ref<Shape> base = MakeRef<Shape>();
        AddPolygon(*base, out.points);
        Finish(req, s, base, b, join, true, forBox, out);
        return out;
    }
    // Mitred corners: the rectangle grown by half the border, less (when
    // hollow) the one shrunk by it, the hole running the other way.
    out.points = maskgeo::RectanglePoints(hw, hh, corner, b / 2, place, s.width);
    out.shape = MakeRef<Shape>();
    AddPolygon(*out.shape, out.points);
    if (!solid) {
        std::vector<maskgeo::Pt> inner = maskgeo::RectanglePoints(hw, hh, corner, -b / 2, place, s.width);
        std::reverse(inner.begin(), inner.end());
        AddPolygon(*out.shape, inner);
    }
    return out;
}

} // namespace Orvane
