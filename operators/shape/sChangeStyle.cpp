#include "operators/shape/sChangeStyle.h"

#include "host/core/Tags.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<sChangeStyle, ShapeOperator>
    s_Registration(OvID("sChangeStyle"), &CLSID_ShapeOperator,
                   {{RegTypeFlags, RegFamilyShape | RegKindOperator | RegKindTool},
                    {RegClassName, "sChangeStyle"},
                    {RegPath, "Tools/Shape/sChangeStyle"},
                    {RegName, "sChangeStyle"},
                    {RegCategory, "Shape"},
                    {RegAbbreviation, "sCs"},
                    {RegHelp, "Changes the fill and line style of shapes"},
                    {RegIcon, "Icons.Tools.Icons.sChangeStyle"},
                    {RegNoBlendControls, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegNoCache, 1},
                    {RegShapeGenFilled, 1},
                    {RegShapeGenOutline, 1},
                    {RegShapeGenTransform, 1},
                    {RegShapeGenStyle, 1}});

sChangeStyle::sChangeStyle(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ShapeOperator(reg, args, tags, true) {
    input_ = AddShapeInput(0, {{InputRequired, 1}});
}

void sChangeStyle::Process(Request *req) {
    Ref<ShapeTree> out = MakeRef<ShapeTree>(req);
    VarianceState state(req);
    if (const ShapeTree *in = GetInputTree(req, input_))
        ProcessTree(*in, *out, [&](const ShapeNode &node, ShapeNode &) {
            Ref<ShapeNode> styled = MakeRef<ShapeNode>(&node, ShapeNode::CopyShape | ShapeNode::CopyState);
            state.SetShape(node);
            styled->SetStyle(GetStyle(state));
            return styled;
        });
    SetOutputTree(req, out);
}

} // namespace Orvane
