// sEllipse: an ellipse of Width x Height about Center, turned by Angle.
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"

namespace Orvane {

class sEllipse : public ShapeGenerator {
public:
    sEllipse(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeGenerator(reg, args, tags) {
        AddCenterInput();
        AddWidthHeightInputs(0.5);
        AddAngleInput();
    }

    void Process(Request *req) override {
        const VarianceState state(req);
        OutputShape(req, *EllipseShape(WidthOf(state) / 2, HeightOf(state) / 2));
    }
};

static ClassRegistration<sEllipse, ShapeOperator> s_Registration(OvID("sEllipse"), &CLSID_ShapeOperator,
                                                                 ShapeToolRow("sEllipse", "sEllipse", "sEls",
                                                                              "Creates an ellipse shape", true));

} // namespace Orvane
