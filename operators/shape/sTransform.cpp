#include "operators/shape/sTransform.h"

#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<sTransform, ShapeOperator>
    s_Registration(OvID("sTransform"), &CLSID_ShapeOperator,
                   {{RegTypeFlags, RegFamilyShape | RegKindOperator | RegKindTool},
                    {RegClassName, "sTransform"},
                    {RegPath, "Tools/Shape/sTransform"},
                    {RegName, "sTransform"},
                    {RegCategory, "Shape"},
                    {RegAbbreviation, "sXf"},
                    {RegHelp, "Moves, rotates and scales shapes"},
                    {RegIcon, "Icons.Tools.Icons.sTransform"},
                    {RegNoBlendControls, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1}});

namespace {

TagList Screw(double low, double high, OvID preview, int member) {
    TagList t{
        {InputControl, CLSID_InputControl_Screw}, {InputDefault, 0.0}, {InputSliderLow, low}, {InputSliderHigh, high}};
    if (preview) t.Add({PreviewControl, preview}), t.Add({PreviewMember, member});
    return t;
}

TagList Size() {
    return {{InputControl, CLSID_InputControl_Slider},
            {InputDefault, 1.0},
            {InputSliderLow, 0.0},
            {InputSliderHigh, 5.0},
            {SliderRest, 1.0}};
}

} // namespace

sTransform::sTransform(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ShapeOperator(reg, args, tags, false) {
    xOffset_ = AddVarianceInputTagList("X Offset", "XOffset", Screw(-1.0, 1.0, CLSID_PreviewControl_Transform, 2));
    yOffset_ = AddVarianceInputTagList("Y Offset", "YOffset", Screw(-1.0, 1.0, CLSID_PreviewControl_Transform, 3));
    xSize_ = AddVarianceInputTagList("X Size", "XSize", Size());
    ySize_ = AddVarianceInputTagList("Y Size", "YSize", Size());
    TagList angle = Screw(-180.0, 180.0, CLSID_PreviewControl_Angle, 0);
    angle.Add({SliderSteps, 3601});
    rotation_ = AddVarianceInputTagList("Rotation", "ZRotation", angle);
    xPivot_ = AddVarianceInputTagList("X Pivot", "XPivot", Screw(-1.0, 1.0, CLSID_PreviewControl_Transform, 0));
    yPivot_ = AddVarianceInputTagList("Y Pivot", "YPivot", Screw(-1.0, 1.0, CLSID_PreviewControl_Transform, 1));
    transformAxis_ = AddInputTagList(
        "Transform Axis", "TransformAxis",
        {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Checkbox}, {InputDefault, 1.0}});
    input_ = AddShapeInput(0, {{InputRequired, 1}});
}

void sTransform::Process(Request *req) {
    const ShapeTree *in = GetInputTree(req, input_);
    Ref<ShapeTree> out = MakeRef<ShapeTree>(req);
    if (!in) return SetOutputTree(req, out);
    const bool moveAxis = req->GetInputNumber(transformAxis_, 1.0) >= 0.5;
    VarianceState state(req);
    Matrix3 matrix; // of the top node being walked: its descendants move with it
    ProcessTree(*in, *out, [&](const ShapeNode &node, ShapeNode &parent) {
        if (&parent == &out->Root()) {
            state.SetShape(node);
            const double px = node.AxisX() + xPivot_->GetValue(state), py = node.AxisY() + yPivot_->GetValue(state);
            // Applied in order: to the pivot, scale, turn, back from the pivot and on by the offset.
            matrix = Matrix3::Translate(px + xOffset_->GetValue(state), py + yOffset_->GetValue(state)) *
                     Matrix3::Rotate(rotation_->GetValue(state)) *
                     Matrix3::Scale(xSize_->GetValue(state), ySize_->GetValue(state)) * Matrix3::Translate(-px, -py);
        }
        Ref<ShapeNode> moved = MakeRef<ShapeNode>(&node, ShapeNode::CopyStyle | ShapeNode::CopyState);
        if (const Shape *shape = node.GetShape()) moved->SetShape(shape->TransformOfShape(matrix));
        if (moveAxis) {
            double ax, ay;
            matrix.Apply(node.AxisX(), node.AxisY(), ax, ay);
            moved->SetAxis(ax, ay);
        }
        return moved;
    });
    SetOutputTree(req, out);
}

} // namespace Orvane
