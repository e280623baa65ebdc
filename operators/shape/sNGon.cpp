// sNGon: a regular polygon of Sides vertices on the ellipse of Width x
// Height about Center, the first vertex straight up before Angle turns it.
#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"

namespace Orvane {

class sNGon : public ShapeGenerator {
public:
    sNGon(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeGenerator(reg, args, tags) {
        AddCenterInput();
        AddWidthHeightInputs(0.5);
        sides_ = AddInputTagList("Sides", "Sides", CountTags(6, 3, 24, 3, 1000));
        AddAngleInput();
    }

    void Process(Request *req) override {
        const VarianceState state(req);
        const int sides = CountOf(req, sides_, 6, 3, 1000);
        OutputShape(req, *RadialPolygonShape(sides, WidthOf(state) / 2, HeightOf(state) / 2, {1.0}));
    }

private:
    Input *sides_;
};

static ClassRegistration<sNGon, ShapeOperator> s_Registration(OvID("sNGon"), &CLSID_ShapeOperator,
                                                              ShapeToolRow("sNGon", "sNGon", "sNGo",
                                                                           "Creates a regular polygon shape", true));

} // namespace Orvane
