#include "operators/mask/TeapotMask.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<TeapotMask, MaskOperator>
    s_Registration(OvID("TeapotMask"), &CLSID_MaskOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindMask},
                    {RegClassName, "TeapotMask"},
                    {RegPath, "Tools/Masks/Teapot"},
                    {RegName, "Teapot"},
                    {RegCategory, "Mask"},
                    {RegHelp, "Creates a Utah teapot mask"},
                    {RegMaskName, "Teapot Mask"},
                    {RegHidden, 1},
                    {RegMaskHasPolygon, 1},
                    {RegOutputType, "Mask"},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

TeapotMask::TeapotMask(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : PrimitiveMask(reg, args, tags) {
    AddCenterAndSize(false);
    AddAngle();
}

PrimitiveMask::Outline TeapotMask::BuildShape(Request *req, const Space &s, bool forBox) const {
    const maskgeo::Placement place = PlacementOf(req, s, req->GetInputNumber(width_), req->GetInputNumber(height_));
    Outline out;
    Ref<Shape> base = MakeRef<Shape>();
    auto contour = [&](const float(*table)[2], int n) {
        std::vector<maskgeo::Pt> points(n);
        for (int i = 0; i < n; ++i) points[i] = place({table[i][0], table[i][1]});
        AddPolygon(*base, points); // the two contours wind opposite ways: the handle's is a hole
        out.points.insert(out.points.end(), points.begin(), points.end());
    };
    contour(maskgeo::kTeapotOuter, 102);
    contour(maskgeo::kTeapotHole, 18);
    Finish(req, s, base, req->GetInputNumber(InBorderWidth()), ShapeJoinRound, false, forBox, out);
    return out;
}

} // namespace Orvane
