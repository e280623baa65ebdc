#include "operators/shape/ShapeModifier.h"

#include "operators/shape/ShapeGenerator.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"

namespace Orvane {

ShapeModifier::ShapeModifier(const Registry *reg, const ScriptVal &args, const TagList &tags, bool withStyle)
    : ShapeOperator(reg, args, tags, withStyle) {}

void ShapeModifier::ReplaceShapes(Request *req, const ShapeTree &in, ShapeTree &out, const ShapeFunction &fn) {
    VarianceState state(req);
    ProcessTree(in, out, [&](const ShapeNode &node, ShapeNode &) -> Ref<ShapeNode> {
        Ref<const Shape> shape = node.ShapeRef();
        if (shape) {
            state.SetShape(node);
            shape = FiniteOrNull(fn(node, state));
            if (shape.Get() == node.GetShape() && node.Children().empty())
                return Ref<ShapeNode>(const_cast<ShapeNode *>(&node)); // kept, not copied
        }
        Ref<ShapeNode> made = MakeRef<ShapeNode>(&node, ShapeNode::CopyStyle | ShapeNode::CopyState);
        made->SetShape(std::move(shape));
        return made;
    });
}

void ShapeModifier::OutputReplaced(Request *req, const Input *input, const ShapeFunction &fn) const {
    Ref<ShapeTree> out = MakeRef<ShapeTree>(req);
    if (const ShapeTree *in = GetInputTree(req, input)) ReplaceShapes(req, *in, *out, fn);
    SetOutputTree(req, out);
}

uint32_t ShapeModifier::MixSeed(uint32_t a, uint32_t b) {
    uint32_t h = a * 0x85ebca6bu ^ (b + 0x9e3779b9u + (a << 6) + (a >> 2));
    h ^= h >> 16;
    h *= 0x7feb352du;
    h ^= h >> 15;
    h *= 0x846ca68bu;
    h ^= h >> 16;
    return h;
}

void ShapeModifier::AddJoinInputs(int def, bool withCap) {
    const auto buttons = [&](const char *name, const char *id, std::initializer_list<const char *> items, int value) {
        TagList t{{LinkDataType, CLSID_DataType_Number},
                  {InputControl, CLSID_InputControl_MultiButton},
                  {InputDefault, static_cast<double>(value)},
                  {InputMinAllowed, 0.0},
                  {InputMaxAllowed, static_cast<double>(items.size() - 1)},
                  {InputInteger, 1}};
        for (const char *item : items) t.Add({ListAddItem, item});
        return AddInputTagList(name, id, t);
    };
    join_ = buttons("Join", "JoinStyle", {"Bevel", "Miter", "Round"}, def);
    if (withCap) cap_ = buttons("Cap", "CapStyle", {"Flat", "Square", "Round"}, ShapeCapFlat);
    TagList limit = SliderTags(ShapeDefaultMiterLimit, 1.0, 10.0, 1.0);
    limit.Add({LinkDataType, CLSID_DataType_Number});
    miterLimit_ = AddInputTagList("Miter Limit", "MiterLimit", limit);
}

TagList ShapeModifier::JoinTags(Request *req) const {
    const auto choice = [req](Input *in, int def) {
        return std::clamp(static_cast<int>(std::lround(req->GetInputNumber(in, def))), 0, 2);
    };
    TagList t{{ShapeJoin, choice(join_, ShapeJoinMiter)},
              {ShapeMiterLimit, std::max(1.0, req->GetInputNumber(miterLimit_, ShapeDefaultMiterLimit))},
              {ShapeTolerance, TessellationTolerance(req)}};
    if (cap_) t.Add({ShapeCap, choice(cap_, ShapeCapFlat)});
    return t;
}

void ShapeModifier::AddSeedInput() {
    seed_ = AddInputTagList("Random Seed", "RandomSeed", CountTags(0, 0, 32767, 0, 4294967295.0));
}

uint32_t ShapeModifier::SeedOf(Request *req) const {
    const double v = std::clamp(req->GetInputNumber(seed_, 0.0), 0.0, 4294967295.0);
    return static_cast<uint32_t>(std::llround(v));
}

} // namespace Orvane
