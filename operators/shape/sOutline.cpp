// sOutline: each shape becomes its stroke, a band of Width (shape units, a
// per-shape number) centred on its path, with the Join, Cap and Miter Limit
// controls; open paths get caps, closed ones none. The node keeps its style,
// axis and copy number, so a fill colour now fills the band.
#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"
#include "operators/shape/ShapeModifier.h"

namespace Orvane {

class sOutline : public ShapeModifier {
public:
    sOutline(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeModifier(reg, args, tags) {
        width_ = AddVarianceInputTagList("Width", "Width", SliderTags(0.01, 0.0, 0.1, 0.0));
        AddJoinInputs(ShapeJoinMiter, true);
        input_ = AddShapeInput(0, {{InputRequired, 1}});
    }

    void Process(Request *req) override {
        const TagList tags = JoinTags(req);
        OutputReplaced(req, input_, [&](const ShapeNode &node, const VarianceState &state) {
            return Ref<const Shape>(node.GetShape()->OutlineOfShapeTagList(width_->GetValue(state), tags));
        });
    }

private:
    VarianceInput *width_;
    Input *input_;
};

static ClassRegistration<sOutline, ShapeOperator> s_Registration(OvID("sOutline"), &CLSID_ShapeOperator,
                                                                 ShapeToolRow("sOutline", "sOutline", "sOut",
                                                                              "Turns shapes into outlines", false));

} // namespace Orvane
