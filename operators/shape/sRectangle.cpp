// sRectangle: a Width x Height rectangle about Center, turned by Angle, its
// corners rounded by quarter circles of Corner Radius (shape units, at most
// half the shorter side).
#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"

namespace Orvane {

class sRectangle : public ShapeGenerator {
public:
    sRectangle(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeGenerator(reg, args, tags) {
        AddCenterInput();
        AddWidthHeightInputs(0.5);
        radius_ = AddVarianceInputTagList("Corner Radius", "CornerRadius", SliderTags(0.0, 0.0, 0.25, 0.0));
        AddAngleInput();
    }

    void Process(Request *req) override {
        const VarianceState state(req);
        OutputShape(req, *RoundedRectangleShape(WidthOf(state), HeightOf(state), radius_->GetValue(state)));
    }

private:
    VarianceInput *radius_;
};

static ClassRegistration<sRectangle, ShapeOperator> s_Registration(OvID("sRectangle"), &CLSID_ShapeOperator,
                                                                   ShapeToolRow("sRectangle", "sRectangle", "sRct",
                                                                                "Creates a rectangle shape", true));

} // namespace Orvane
