// sJitter: moves every point of every shape by a random amount, up to X
// Amount across and Y Amount up (shape units, per-shape numbers), drawn
// evenly from -amount..amount. Curve handles move with the point they leave
// from or arrive at, so curves keep their smoothness; the closing point of
// a sub-path that returns to its start moves with the start, so nothing
// opens. The draws come from the Random Seed, the node's own seed (copies
// differ) and the node's place in the tree: the same seed gives the same
// shapes, another seed others. Amounts of 0 keep the node by reference.
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"
#include "operators/shape/ShapeModifier.h"

namespace Orvane {

class sJitter : public ShapeModifier {
public:
    sJitter(const Registry *reg, const ScriptVal &args, const TagList &tags) : ShapeModifier(reg, args, tags) {
        const TagList amount = SliderTags(0.01, 0.0, 0.1);
        xAmount_ = AddVarianceInputTagList("X Amount", "XAmount", amount);
        yAmount_ = AddVarianceInputTagList("Y Amount", "YAmount", amount);
        AddSeedInput();
        input_ = AddShapeInput(0, {{InputRequired, 1}});
    }

    void Process(Request *req) override {
        const uint32_t seed = SeedOf(req);
        uint32_t place = 0;
        OutputReplaced(req, input_, [&](const ShapeNode &node, const VarianceState &state) {
            const double ax = xAmount_->GetValue(state), ay = yAmount_->GetValue(state);
            MtRand rng = CreateRNG(MixSeed(MixSeed(seed, node.Seed()), place++));
            if (ax == 0.0 && ay == 0.0) return node.ShapeRef();
            return Ref<const Shape>(Jittered(*node.GetShape(), ax, ay, rng));
        });
    }

private:
    static Ref<Shape> Jittered(const Shape &shape, double ax, double ay, MtRand &rng) {
        const auto draw = [&rng](double amount) { return amount * (2.0 * (rng.Next32() / 4294967296.0) - 1.0); };
        Ref<Shape> s = MakeRef<Shape>();
        for (const Shape::SubPath &sp : shape.SubPaths()) {
            const std::vector<Shape::Vertex> &p = sp.points;
            const size_t n = p.size();
            std::vector<ShapePoint> move(n);
            size_t lastOn = 0;
            for (size_t i = 0; i < n; ++i)
                if (!p[i].control) move[i] = {draw(ax), draw(ay)}, lastOn = i;
            if (sp.closed && lastOn > 0 && p[lastOn].x == p[0].x && p[lastOn].y == p[0].y) move[lastOn] = move[0];
            // A handle follows the on-curve point beside it: the first of a pair the one before, the second the
            // one after.
            for (size_t i = 0; i < n; ++i)
                if (p[i].control) move[i] = !p[i - 1].control ? move[i - 1] : move[i + 1];
            const auto at = [&](size_t i) { return ShapePoint{p[i].x + move[i].x, p[i].y + move[i].y}; };
            if (n) s->MoveTo(at(0).x, at(0).y);
            for (size_t i = 1; i < n; ++i) {
                if (!p[i].control) {
                    s->LineTo(at(i).x, at(i).y);
                    continue;
                }
                const ShapePoint c1 = at(i), c2 = at(i + 1), to = at(i + 2);
                s->BezierTo(c1.x, c1.y, c2.x, c2.y, to.x, to.y);
                i += 2;
            }
            if (sp.closed) s->Close();
        }
        return s;
    }

    VarianceInput *xAmount_, *yAmount_;
    Input *input_;
};

static ClassRegistration<sJitter, ShapeOperator>
    s_Registration(OvID("sJitter"), &CLSID_ShapeOperator,
                   ShapeToolRow("sJitter", "sJitter", "sJit", "Moves the points of shapes at random", false));

} // namespace Orvane
