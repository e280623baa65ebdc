#include "operators/shape/sMerge.h"

#include "host/core/Tags.h"
#include "host/flow/Link.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<sMerge, ShapeOperator>
    s_Registration(OvID("sMerge"), &CLSID_ShapeOperator,
                   {{RegTypeFlags, RegFamilyShape | RegKindOperator | RegKindTool | RegKindVariableInputs},
                    {RegClassName, "sMerge"},
                    {RegPath, "Tools/Shape/sMerge"},
                    {RegName, "sMerge"},
                    {RegCategory, "Shape"},
                    {RegAbbreviation, "sMrg"},
                    {RegHelp, "Merges several shape inputs into one"},
                    {RegIcon, "Icons.Tools.Icons.sMerge"},
                    {RegNoBlendControls, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1}});

sMerge::sMerge(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ShapeOperator(reg, args, tags, false) {
    overrideAxis_ = AddInputTagList(
        "Override Axis", "OverrideAxis",
        {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Checkbox}, {InputDefault, 0.0}});
    inputs_.push_back(AddShapeInput(1, {{InputNotify, 1}}));
}

void sMerge::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    // Linking the last input opens the next one.
    if (in == inputs_.back() && in->Link())
        inputs_.push_back(AddShapeInput(static_cast<int>(inputs_.size()) + 1, {{InputNotify, 1}}));
    ShapeOperator::NotifyChanged(in, param, time, tags);
}

void sMerge::Process(Request *req) {
    Ref<ShapeTree> out = MakeRef<ShapeTree>(req);
    for (const Input *in : inputs_)
        if (const ShapeTree *tree = GetInputTree(req, in)) out->Append(*tree);
    if (req->GetInputNumber(overrideAxis_, 0.0) >= 0.5) {
        const ImgRectF box = out->Bounds();
        if (!box.IsEmpty()) {
            Ref<ShapeTree> moved = MakeRef<ShapeTree>(req);
            for (const Ref<ShapeNode> &node : out->Root().Children()) {
                Ref<ShapeNode> copy = MakeRef<ShapeNode>(node.Get(), ShapeNode::CopyAll);
                copy->SetAxis(0.5 * (box.x0 + box.x1), 0.5 * (box.y0 + box.y1));
                moved->Root().AppendChild(std::move(copy));
            }
            out = moved;
        }
    }
    SetOutputTree(req, out);
}

} // namespace Orvane
