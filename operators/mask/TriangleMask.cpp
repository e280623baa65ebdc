#include "operators/mask/TriangleMask.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<TriangleMask, MaskOperator>
    s_Registration(OvID("TriangleMask"), &CLSID_MaskOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindMask},
                    {RegClassName, "TriangleMask"},
                    {RegPath, "Tools/Masks/Triangle"},
                    {RegName, "Triangle"},
                    {RegCategory, "Mask"},
                    {RegHelp, "Draw a triangle"},
                    {RegIcon, "Icons.Tools.Icons.TriangleMask"},
                    {RegMaskHasPolygon, 1},
                    {RegOutputType, "Mask"},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

TriangleMask::TriangleMask(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : PrimitiveMask(reg, args, tags) {
    static const char *const labels[3] = {"Point 1", "Point 2", "Point 3"}, *const ids[3] = {"Point1", "Point2",
                                                                                             "Point3"};
    static const double defaults[3][2] = {{0.1, 0.1}, {0.9, 0.1}, {0.5, 0.9}};
    for (int i = 0; i < 3; ++i)
        points_[i] = AddInputTagList(labels[i], ids[i],
                                     {{LinkDataType, CLSID_DataType_Point},
                                      {InputControl, CLSID_InputControl_Offset},
                                      {PreviewControl, CLSID_PreviewControl_Point},
                                      {InputDefaultX, defaults[i][0]},
                                      {InputDefaultY, defaults[i][1]}});
}

PrimitiveMask::Outline TriangleMask::BuildShape(Request *req, const Space &s, bool forBox) const {
    Outline out;
    for (Input *in : points_) {
        const auto *p = dynamic_cast<const Point *>(req->GetInputData(in));
        if (p) out.points.push_back({p->x, p->y * s.aspect});
    }
    if (out.points.size() != 3) return out;
    Ref<Shape> base = MakeRef<Shape>();
    AddPolygon(*base, out.points);
    Finish(req, s, base, req->GetInputNumber(InBorderWidth()),
           maskgeo::JoinOfButton(req->GetInputNumber(InJoinStyle())), true, forBox, out);
    return out;
}

} // namespace Orvane
