// sExpand: each shape's filled region grown by Amount (shape units, a
// per-shape number), or shrunk by a negative one, with the Join and Miter
// Limit controls (Round by default: the true offset, every point of the new
// edge at Amount from the old). A shape shrunk past itself is left empty;
// an Amount of 0 keeps the node as it is, by reference.
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"
#include "operators/shape/ShapeModifier.h"

namespace Orvane {

class sExpand : public ShapeModifier {
public:
    sExpand(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeModifier(reg, args, tags) {
        amount_ = AddVarianceInputTagList("Amount", "Amount", SliderTags(0.01, -0.1, 0.1));
        AddJoinInputs(ShapeJoinRound, false);
        input_ = AddShapeInput(0, {{InputRequired, 1}});
    }

    void Process(Request *req) override {
        const TagList tags = JoinTags(req);
        OutputReplaced(req, input_, [&](const ShapeNode &node, const VarianceState &state) {
            const double amount = amount_->GetValue(state);
            if (amount == 0.0 || !std::isfinite(amount)) return node.ShapeRef();
            return Ref<const Shape>(node.GetShape()->ExpandOfShapeTagList(amount, true, tags));
        });
    }

private:
    VarianceInput *amount_;
    Input *input_;
};

static ClassRegistration<sExpand, ShapeOperator>
    s_Registration(OvID("sExpand"), &CLSID_ShapeOperator,
                   ShapeToolRow("sExpand", "sExpand", "sExp", "Grows or shrinks the outlines of shapes", false));

} // namespace Orvane
