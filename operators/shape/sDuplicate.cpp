// sDuplicate: Copies copies of the input's top nodes (each with everything
// under it), the original being copy 0. Copy k of a node is scaled by
// (X Size^k, Y Size^k) and turned by k x Rotation degrees about the node's
// axis, then moved by k x (X Offset, Y Offset); its axis goes with it. The
// numbers are per-shape, read for the node being copied. The output holds
// copy 0 of every top node, then copy 1 of every one, and so on, so later
// copies draw over earlier ones.
//
// Every node of copy k is marked copy k with a seed drawn from Random Seed,
// k and the top node's place, so later tools' Step and Random parts make
// the copies differ. Copy 0 keeps the input's shapes by reference.
#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"
#include "operators/shape/ShapeModifier.h"

namespace Orvane {

constexpr int kMostNodes = 1 << 20;

class sDuplicate : public ShapeModifier {
public:
    sDuplicate(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeModifier(reg, args, tags) {
        copies_ = AddInputTagList("Copies", "Copies", CountTags(5, 1, 50, 1, 10000));
        const auto screw = [](double def, double low, double high) {
            return TagList{{InputControl, CLSID_InputControl_Screw},
                           {InputDefault, def},
                           {InputSliderLow, low},
                           {InputSliderHigh, high}};
        };
        xOffset_ = AddVarianceInputTagList("X Offset", "XOffset", screw(0.05, -0.5, 0.5));
        yOffset_ = AddVarianceInputTagList("Y Offset", "YOffset", screw(0.0, -0.5, 0.5));
        TagList size = SliderTags(1.0, 0.0, 2.0);
        size.Add({SliderRest, 1.0});
        xSize_ = AddVarianceInputTagList("X Size", "XSize", size);
        ySize_ = AddVarianceInputTagList("Y Size", "YSize", size);
        rotation_ = AddVarianceInputTagList("Rotation", "ZRotation", screw(0.0, -180.0, 180.0));
        AddSeedInput();
        input_ = AddShapeInput(0, {{InputRequired, 1}});
    }

    void Process(Request *req) override {
        Ref<ShapeTree> out = MakeRef<ShapeTree>(req);
        const ShapeTree *in = GetInputTree(req, input_);
        if (!in) return SetOutputTree(req, out);
        // At most about a million nodes out, whatever the input holds.
        const int copies = CountOf(req, copies_, 5, 1, std::clamp(kMostNodes / std::max(in->NodeCount(), 1), 1, 10000));
        const uint32_t seed = SeedOf(req);
        VarianceState state(req);
        const auto &tops = in->Root().Children();
        for (int k = 0; k < copies; ++k)
            for (size_t i = 0; i < tops.size(); ++i) {
                const ShapeNode &top = *tops[i];
                state.SetShape(top);
                const double ax = top.AxisX(), ay = top.AxisY();
                const Matrix3 m =
                    Matrix3::Translate(ax + k * xOffset_->GetValue(state), ay + k * yOffset_->GetValue(state)) *
                    Matrix3::Rotate(k * rotation_->GetValue(state)) *
                    Matrix3::Scale(std::pow(xSize_->GetValue(state).value, k),
                                   std::pow(ySize_->GetValue(state).value, k)) *
                    Matrix3::Translate(-ax, -ay);
                out->Root().AppendChild(Copy(top, m, k, MixSeed(MixSeed(seed, static_cast<uint32_t>(i)), k)));
            }
        SetOutputTree(req, out);
    }

private:
    /// Copy `k` of `node` and everything under it, moved by `m` (copy 0 keeps the shapes by reference).
    static Ref<ShapeNode> Copy(const ShapeNode &node, const Matrix3 &m, int k, uint32_t seed) {
        Ref<ShapeNode> made = MakeRef<ShapeNode>(&node, ShapeNode::CopyStyle | ShapeNode::CopyState);
        if (const Shape *shape = node.GetShape())
            made->SetShape(k == 0 ? node.ShapeRef() : Ref<const Shape>(shape->TransformOfShape(m)));
        double ax, ay;
        m.Apply(node.AxisX(), node.AxisY(), ax, ay);
        made->SetAxis(ax, ay);
        made->SetCopy(k, seed);
        for (const Ref<ShapeNode> &child : node.Children()) made->AppendChild(Copy(*child, m, k, seed));
        return made;
    }

    Input *copies_, *input_;
    VarianceInput *xOffset_, *yOffset_, *xSize_, *ySize_, *rotation_;
};

static ClassRegistration<sDuplicate, ShapeOperator>
    s_Registration(OvID("sDuplicate"), &CLSID_ShapeOperator,
                   ShapeToolRow("sDuplicate", "sDuplicate", "sDup", "Makes offset copies of shapes", false));

} // namespace Orvane
