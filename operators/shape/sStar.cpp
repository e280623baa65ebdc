// sStar: a star of Points tips on the ellipse of Width x Height about
// Center (the first straight up before Angle turns it), its inner corners
// halfway between, at Inner Radius times the outer radius.
#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"

namespace Orvane {

class sStar : public ShapeGenerator {
public:
    sStar(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeGenerator(reg, args, tags) {
        AddCenterInput();
        AddWidthHeightInputs(0.5);
        points_ = AddInputTagList("Points", "Points", CountTags(5, 2, 24, 2, 1000));
        inner_ = AddVarianceInputTagList("Inner Radius", "InnerRadius", SliderTags(0.5, 0.0, 1.0));
        AddAngleInput();
    }

    void Process(Request *req) override {
        const VarianceState state(req);
        const int points = CountOf(req, points_, 5, 2, 1000);
        const double inner = inner_->GetValue(state);
        OutputShape(req, *RadialPolygonShape(2 * points, WidthOf(state) / 2, HeightOf(state) / 2, {1.0, inner}));
    }

private:
    Input *points_;
    VarianceInput *inner_;
};

static ClassRegistration<sStar, ShapeOperator> s_Registration(OvID("sStar"), &CLSID_ShapeOperator,
                                                              ShapeToolRow("sStar", "sStar", "sStr",
                                                                           "Creates a star shape", true));

} // namespace Orvane
