#include "host/shape/ShapeOperator.h"

#include <algorithm>
#include <cmath>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"

namespace Orvane {

namespace {

/// A draw in [0, 1) from a shape's seed and an input's salt (a 32-bit mix, the same on every platform).
double Draw(uint32_t seed, uint32_t salt) {
    uint32_t h = seed * 0x9e3779b9u ^ salt;
    h ^= h >> 16;
    h *= 0x7feb352du;
    h ^= h >> 15;
    h *= 0x846ca68bu;
    h ^= h >> 16;
    return h / 4294967296.0;
}

uint32_t SaltOf(const char *id) {
    uint32_t h = 2166136261u; // FNV-1a
    for (const char *c = id; *c; ++c) h = (h ^ static_cast<unsigned char>(*c)) * 16777619u;
    return h;
}

} // namespace

VarianceInput::VarianceInput(Input *value, Input *step, Input *random)
    : value_(value), step_(step), random_(random), salt_(SaltOf(value->ID().Text())) {}

VarianceValue VarianceInput::GetValue(const VarianceState &state) const {
    const Request *req = state.req;
    const auto number = [req](const Input *in, double fallback) {
        return req ? req->GetInputNumber(in, fallback) : fallback;
    };
    double v = number(value_, 0.0);
    if (const double step = number(step_, 0.0); step != 0.0) v += step * state.index;
    if (const double amount = number(random_, 0.0); amount != 0.0) v += amount * (2.0 * Draw(state.seed, salt_) - 1.0);
    return {v};
}

// ---- the style controls ----

struct ShapeOperator::StyleInputs {
    Input *fill = nullptr, *line = nullptr, *join = nullptr, *cap = nullptr, *miterLimit = nullptr;
    VarianceInput *fillColor[4] = {}, *lineColor[4] = {}, *opacity = nullptr, *lineWidth = nullptr;
};

namespace {

TagList With(TagList base, const TagList &more) {
    base.Merge(more);
    return base;
}

TagList Checkbox(int page, double def) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Checkbox},
            {InputDefault, def},
            {ControlPage, page}};
}

TagList Buttons(int page, std::initializer_list<const char *> items, double def) {
    TagList t{{LinkDataType, CLSID_DataType_Number},
              {InputControl, CLSID_InputControl_MultiButton},
              {InputDefault, def},
              {InputMinAllowed, 0.0},
              {InputMaxAllowed, static_cast<double>(items.size() - 1)},
              {InputInteger, 1},
              {ControlPage, page}};
    for (const char *item : items) t.Add({ListAddItem, item});
    return t;
}

TagList Slider(int page, double def, double low, double high, double minAllowed) {
    return {{InputControl, CLSID_InputControl_Slider},
            {InputDefault, def},
            {InputSliderLow, low},
            {InputSliderHigh, high},
            {InputMinAllowed, minAllowed},
            {ControlPage, page}};
}

} // namespace

ShapeOperator::ShapeOperator(const Registry *reg, const ScriptVal &args, const TagList &tags, bool withStyle,
                             OvID outputType)
    : ThreadedOperator(reg, args, tags), withStyle_(withStyle) {
    AddControlPageTagList("Controls", {});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, outputType}, {LinkMain, 1}});
}

void ShapeOperator::FinishConstruction() {
    if (withStyle_) AddStyleControls();
    ThreadedOperator::FinishConstruction();
}

void ShapeOperator::AddStyleControls() {
    const int page = AddControlPageTagList("Style", {});
    style_ = std::make_unique<StyleInputs>();
    StyleInputs &s = *style_;
    struct Channel {
        const char *name;
        int colorChannel;
    };
    constexpr Channel kChannels[4] = {{"Red", ColorChannelRed},
                                      {"Green", ColorChannelGreen},
                                      {"Blue", ColorChannelBlue},
                                      {"Alpha", ColorChannelAlpha}};
    const auto colour = [&](const char *label, const char *prefix, int group, const float *defaults,
                            VarianceInput **out) {
        for (int c = 0; c < 4; ++c) {
            const std::string id = std::string(prefix) + kChannels[c].name;
            const std::string name = std::string(label) + " " + kChannels[c].name;
            TagList t{{InputControl, CLSID_InputControl_Color},         {ControlGroup, group}, {ControlMember, c},
                      {ColorChannel, kChannels[c].colorChannel},        {InputSliderLow, 0.0}, {InputSliderHigh, 1.0},
                      {InputDefault, static_cast<double>(defaults[c])}, {ControlPage, page}};
            if (c == 0) t.Add({ControlLabel, label});
            out[c] = AddVarianceInputTagList(name.c_str(), id.c_str(), t);
        }
    };
    const ShapeStyle def;
    s.fill = AddInputTagList("Fill", "Fill", Checkbox(page, def.fill));
    colour("Fill Color", "Fill", 1, def.fillColor, s.fillColor);
    s.line = AddInputTagList("Line", "Line", Checkbox(page, def.line));
    colour("Line Color", "Line", 2, def.lineColor, s.lineColor);
    s.lineWidth = AddVarianceInputTagList("Line Width", "LineWidth", Slider(page, def.lineWidth, 0.0, 0.05, 0.0));
    s.join = AddInputTagList("Join", "JoinStyle", Buttons(page, {"Bevel", "Miter", "Round"}, def.join));
    s.cap = AddInputTagList("Cap", "CapStyle", Buttons(page, {"Flat", "Square", "Round"}, def.cap));
    s.miterLimit =
        AddInputTagList("Miter Limit", "MiterLimit",
                        With(Slider(page, def.miterLimit, 1.0, 10.0, 1.0), {{LinkDataType, CLSID_DataType_Number}}));
    s.opacity = AddVarianceInputTagList("Opacity", "Opacity", Slider(page, def.opacity, 0.0, 1.0, 0.0));
}

ShapeOperator::~ShapeOperator() = default;

Input *ShapeOperator::AddShapeInput(int index, const TagList &tags) {
    const std::string id = index <= 0 ? "Input" : "Input" + std::to_string(index);
    const std::string name = index <= 0 ? "Input" : "Input " + std::to_string(index);
    TagList t{{LinkDataType, CLSID_DataType_ShapeTree}, {LinkMain, std::max(index, 1)}, {InputRequired, 0}};
    t.Merge(tags);
    return AddInputTagList(name.c_str(), id.c_str(), t);
}

VarianceInput *ShapeOperator::AddVarianceInputTagList(const char *name, const char *id, const TagList &tags) {
    TagList valueTags{{LinkDataType, CLSID_DataType_Number}};
    valueTags.Merge(tags);
    Input *value = AddInputTagList(name, id, valueTags);
    TagList partTags{
        {LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Slider}, {InputDefault, 0.0}};
    if (const long long page = tags.GetLong(ControlPage, -1); page >= 0) partTags.Add({ControlPage, page});
    const std::string stepId = std::string(id) + "Step", randomId = std::string(id) + "Random";
    const std::string stepName = std::string(name) + " Step", randomName = std::string(name) + " Random";
    // The parts' sliders follow the value's: a step of up to a quarter of its range, a spread of up to half.
    const double span = tags.GetDouble(InputSliderHigh, 1.0) - tags.GetDouble(InputSliderLow, 0.0);
    const double reach = span > 0.0 && std::isfinite(span) ? span : 1.0;
    Input *step = AddInputTagList(stepName.c_str(), stepId.c_str(),
                                  With(partTags, {{InputSliderLow, -0.25 * reach}, {InputSliderHigh, 0.25 * reach}}));
    Input *random = AddInputTagList(
        randomName.c_str(), randomId.c_str(),
        With(partTags, {{InputSliderLow, 0.0}, {InputSliderHigh, 0.5 * reach}, {InputMinAllowed, 0.0}}));
    variance_.push_back(std::make_unique<VarianceInput>(value, step, random));
    return variance_.back().get();
}

ShapeStyle ShapeOperator::GetStyle(const VarianceState &state) const {
    ShapeStyle st;
    if (!style_) return st;
    const StyleInputs &s = *style_;
    const Request *req = state.req;
    const auto number = [req](const Input *in, double fallback) {
        return req ? req->GetInputNumber(in, fallback) : fallback;
    };
    st.fill = number(s.fill, st.fill) >= 0.5;
    st.line = number(s.line, st.line) >= 0.5;
    for (int c = 0; c < 4; ++c) {
        st.fillColor[c] = static_cast<float>(s.fillColor[c]->GetValue(state).value);
        st.lineColor[c] = static_cast<float>(s.lineColor[c]->GetValue(state).value);
    }
    // Alphas and opacity beyond 0..1 have no meaning; colours may go beyond (float output).
    st.fillColor[3] = std::clamp(st.fillColor[3], 0.f, 1.f);
    st.lineColor[3] = std::clamp(st.lineColor[3], 0.f, 1.f);
    st.opacity = std::clamp(s.opacity->GetValue(state).value, 0.0, 1.0);
    st.lineWidth = std::max(0.0, s.lineWidth->GetValue(state).value);
    st.join = std::clamp(static_cast<int>(std::lround(number(s.join, st.join))), 0, 2);
    st.cap = std::clamp(static_cast<int>(std::lround(number(s.cap, st.cap))), 0, 2);
    st.miterLimit = std::max(1.0, number(s.miterLimit, st.miterLimit));
    return st;
}

void ShapeOperator::ProcessTree(const ShapeTree &in, ShapeTree &out,
                                const std::function<Ref<ShapeNode>(const ShapeNode &, ShapeNode &)> &fn) {
    struct Walk {
        const std::function<Ref<ShapeNode>(const ShapeNode &, ShapeNode &)> &fn;
        void Children(const ShapeNode &from, ShapeNode &into) {
            for (const Ref<ShapeNode> &child : from.Children()) {
                Ref<ShapeNode> made = fn(*child, into);
                if (!made) continue;
                const bool kept = made.Get() == child.Get();
                ShapeNode &placed = *made;
                into.AppendChild(std::move(made));
                if (!kept) Children(*child, placed);
            }
        }
    } walk{fn};
    walk.Children(in.Root(), out.Root());
}

void ShapeOperator::AddShapeToPaths(const Shape &shape, ClipPaths &paths, double tolerance, bool normalise) {
    if (!normalise) return AppendShapePaths(shape, paths, tolerance);
    ClipPaths raw;
    AppendShapePaths(shape, raw, tolerance);
    ShapeClipper clipper;
    clipper.AddPaths(raw, true);
    ClipPaths region;
    if (clipper.Execute(ClipOperation::Union, region)) paths.insert(paths.end(), region.begin(), region.end());
}

void ShapeOperator::AddShapeUnionToPaths(const ShapeTree &tree, ClipPaths &paths, double tolerance, bool normalise) {
    ClipPaths all;
    const std::function<void(const ShapeNode &)> gather = [&](const ShapeNode &node) {
        if (const Shape *shape = node.GetShape()) AddShapeToPaths(*shape, all, tolerance, normalise);
        for (const Ref<ShapeNode> &c : node.Children()) gather(*c);
    };
    gather(tree.Root());
    ShapeClipper clipper;
    clipper.AddPaths(all, true);
    ClipPaths united;
    if (clipper.Execute(ClipOperation::Union, united)) paths.insert(paths.end(), united.begin(), united.end());
}

Ref<Shape> ShapeOperator::AddPathsToShape(const ClipPaths &paths) { return ShapeOfClipPaths(paths); }

double ShapeOperator::TessellationTolerance(Request *req) {
    double res = 4.0 * ShapeTree::s_TessBase;
    if (req && req->RoI() && req->RoI()->HasFrame()) res = req->RoI()->FrameWidth();
    return 2.0 / std::max(res, 1.0);
}

void ShapeOperator::SetOutputTree(Request *req, Ref<ShapeTree> tree) const { req->SetOutputData(output_, tree.Get()); }

const ShapeTree *ShapeOperator::GetInputTree(Request *req, const Input *in) {
    return req && in ? dynamic_cast<const ShapeTree *>(req->GetInputData(in)) : nullptr;
}

void ShapeOperator::CheckRequest(Request *req) {
    // Shape inputs flatten for the frame the request is for: the reference frame travels up with the region.
    if (const auto &roi = req->RoI())
        for (const auto &in : Inputs())
            if (in->DataType() == CLSID_DataType_ShapeTree) req->SetInputRoI(in.get(), &*roi);
    ThreadedOperator::CheckRequest(req);
}

} // namespace Orvane
