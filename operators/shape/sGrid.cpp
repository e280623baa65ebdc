// sGrid: the lines of a grid of Cells Across x Cells Down cells over the
// Width x Height rectangle about Center, turned by Angle. Each line is a
// thin closed bar of Line Thickness (shape units) centred on it, one node
// per line (the vertical ones left to right, then the horizontal ones
// bottom to top), its axis at the bar's middle: bars fill with the style's
// fill, so the grid shows with the default style, and later tools (outline,
// expand, per-shape variance) treat each line as a shape. The bars run half
// a thickness past the rectangle so that its corners are square.
#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"

namespace Orvane {

class sGrid : public ShapeGenerator {
public:
    sGrid(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeGenerator(reg, args, tags) {
        AddCenterInput();
        AddWidthHeightInputs(0.8);
        across_ = AddInputTagList("Cells Across", "CellsAcross", CountTags(8, 1, 32, 1, 4096));
        down_ = AddInputTagList("Cells Down", "CellsDown", CountTags(4, 1, 32, 1, 4096));
        thickness_ = AddVarianceInputTagList("Line Thickness", "LineThickness", SliderTags(0.002, 0.0, 0.02, 0.0));
        AddAngleInput();
    }

    void Process(Request *req) override {
        const VarianceState state(req);
        const int across = CountOf(req, across_, 8, 1, 4096), down = CountOf(req, down_, 4, 1, 4096);
        const double w = WidthOf(state), h = HeightOf(state), t = thickness_->GetValue(state);
        const Placement at = PlacementOf(req, state);
        const Matrix3 place = Matrix3::Translate(at.cx, at.cy) * Matrix3::Rotate(at.angle);
        Ref<ShapeTree> tree = MakeRef<ShapeTree>(req);
        const auto bar = [&](double x, double y, double bw, double bh) {
            const Ref<Shape> local = RoundedRectangleShape(bw, bh, 0.0)->TransformOfShape(Matrix3::Translate(x, y));
            Ref<ShapeNode> node = PlacedNode(*local, at, state);
            double ax, ay;
            place.Apply(x, y, ax, ay);
            node->SetAxis(ax, ay);
            tree->Root().AppendChild(std::move(node));
        };
        for (int i = 0; i <= across; ++i) bar(w * (static_cast<double>(i) / across - 0.5), 0.0, t, h + t);
        for (int j = 0; j <= down; ++j) bar(0.0, h * (static_cast<double>(j) / down - 0.5), w + t, t);
        SetOutputTree(req, tree);
    }

private:
    Input *across_, *down_;
    VarianceInput *thickness_;
};

static ClassRegistration<sGrid, ShapeOperator> s_Registration(OvID("sGrid"), &CLSID_ShapeOperator,
                                                              ShapeToolRow("sGrid", "sGrid", "sGrd",
                                                                           "Creates a grid of lines", false));

} // namespace Orvane
