#include "operators/mask/MultiPoly.h"

#include <algorithm>
#include <cmath>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/PaintModes.h"
#include "host/image/PixelMemory.h"
#include "operators/frame/Registration.h"

namespace Orvane {

namespace {

const ClassRegistration<MultiPoly, MaskOperator>
    s_Registration(CLSID_Mask_MultiPoly, &CLSID_MaskOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindMask},
                    {RegClassName, "MultiPoly"},
                    {RegPath, "Tools/Mask/MultiPoly"},
                    {RegName, "MultiPoly"},
                    {RegCategory, "Mask"},
                    {RegAbbreviation, "MPly"},
                    {RegHelp, "Multi-layer Polygon Mask"},
                    {RegIcon, "Icons.Tools.Icons.MultiPoly"},
                    {RegAlias, "Rotoscope"},
                    {RegAlias, "Roto"},
                    {RegAlias, "Mask"},
                    {RegMaskMultiPart, 1},
                    {RegOutputType, "Mask"},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

/// The tool-table key listing the B-spline layers.
constexpr const char *kBSplineLayers = "BSplineLayers";

/// The layer IDs of a PolyOrder value in table order: its entries that are
/// whole numbers above 0. Nothing when the value is no table.
std::vector<int> IDsOf(const Parameter *value) {
    std::vector<int> ids;
    const auto *order = dynamic_cast<const ScriptValue *>(value);
    if (!order || !order->value.IsTable()) return ids;
    for (const auto &entry : order->value.Entries())
        if (entry.second.IsNumber() && entry.second.AsNumber() >= 1) ids.push_back(int(entry.second.AsNumber()));
    return ids;
}

bool Pressed(const Parameter *param) {
    const auto *n = dynamic_cast<const Number *>(param);
    return n && n->value >= 0.5;
}

} // namespace

MultiPoly::MultiPoly(const Registry *reg, const ScriptVal &args, const TagList &tags) : MaskOperator(reg, args, tags) {
    SetControlPageTags(0, {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.PolyLine")}});
    // Each layer carries its own mask controls; the tool's set stays hidden.
    const MaskControls &c = Controls();
    for (Input *in : {c.level, c.filter, c.softEdge, c.passes, c.borderWidth, c.paintMode, c.invert, c.solid,
                      c.joinStyle, c.miterLimit, c.capStyle, c.writePosition, c.writeLength})
        in->SetAttrsTagList({{ControlVisible, 0}});
    auto list = [&](const char *name, const char *id, const TagList &more) {
        TagList t{{LinkDataType, CLSID_DataType_ScriptVal},
                  {InputControl, CLSID_InputControl_CheckList},
                  {InputExternal, 0},
                  {ControlGroup, 1}};
        t.Merge(more);
        return AddInputTagList(name, id, t);
    };
    polyOrder_ =
        list("Polygon Order", "PolyOrder", {{ControlLabel, "Polygon List"}, {ControlMember, 3}, {InputNotify, 1}});
    polySelection_ =
        list("Polygon Selection", "PolySelection", {{ControlMember, 0}, {InputPassive, 1}, {LinkNotSaved, 1}});
    auto button = [&](const char *name, const char *id, const char *text, int member) {
        return AddInputTagList(name, id,
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Button},
                                {ControlLabel, text},
                                {ControlGroup, 2},
                                {ControlMember, member},
                                {InputExternal, 0},
                                {InputNotify, 1},
                                {InputInitialNotify, 0},
                                {InputPassive, 1},
                                {LinkNotSaved, 1}});
    };
    addPolygon_ = button("Add Polygon", "AddPolygon", "Polygon", 1);
    addPolygon_->SetAttrsTagList({{ControlRowLabel, "Add Poly"}});
    addBSpline_ = button("Add BSpline", "AddBSpline", "BSpline", 2);
}

MultiPoly::~MultiPoly() = default;

MultiPoly::Layer &MultiPoly::EnsureLayer(int n, bool bspline) {
    if (auto it = layers_.find(n); it != layers_.end()) return it->second;
    Layer layer;
    layer.bspline = bspline;
    const std::string num = std::to_string(n), group = "PolyMask" + num;
    const std::string title = (bspline ? "BSpline " : "Polygon ") + num;
    SetCurrentPage(page_); // layers made after construction stay on the polygon page
    BeginControlNestTagList(title.c_str(), group.c_str(), true, {});
    layer.name = AddInputTagList((title + " Name").c_str(), ("PolyMaskName" + num).c_str(),
                                 {{LinkDataType, CLSID_DataType_Text},
                                  {InputControl, CLSID_InputControl_TextEdit},
                                  {InputDefaultText, title.c_str()},
                                  {InputExternal, 0}});
    layer.enabled = AddInputTagList(
        (title + " Enabled").c_str(), ("PolyMaskEnabled" + num).c_str(),
        {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Checkbox}, {InputDefault, 1.0}});
    auto button = [&](const char *label, const char *id) {
        return AddInputTagList(label, (id + num).c_str(),
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Button},
                                {InputExternal, 0},
                                {InputNotify, 1},
                                {InputInitialNotify, 0},
                                {InputPassive, 1},
                                {LinkNotSaved, 1}});
    };
    layer.remove = button("Delete Layer", "PolyMaskDelete");
    layer.reset = button("Reset Layer to Default", "PolyMaskReset");
    PolyMaskInputs::Options options;
    options.bspline = bspline;
    layer.poly = std::make_unique<PolyMaskInputs>(this, group, options);
    EndControlNest();
    SetCurrentPage(-1);
    Layer &made = layers_.emplace(n, std::move(layer)).first->second;
    RecordKinds();
    return made;
}

int MultiPoly::AddLayer(bool bspline) {
    std::vector<int> order = IDsOf(polyOrder_->Constant().Get());
    int n = layers_.empty() ? 1 : layers_.rbegin()->first + 1;
    for (int id : order) n = std::max(n, id + 1);
    EnsureLayer(n, bspline);
    order.push_back(n);
    SetOrder(order);
    return n;
}

void MultiPoly::DeleteLayer(int n) {
    auto it = layers_.find(n);
    if (it == layers_.end()) return;
    std::vector<int> order = IDsOf(polyOrder_->Constant().Get());
    order.erase(std::remove(order.begin(), order.end(), n), order.end());
    SetOrder(order);
    std::vector<Input *> inputs = it->second.poly->AllInputs();
    inputs.insert(inputs.end(), {it->second.name, it->second.enabled, it->second.remove, it->second.reset});
    RemoveInputs(inputs);
    layers_.erase(it);
    RecordKinds();
}

void MultiPoly::ResetLayer(Layer &layer) {
    for (Input *in : layer.poly->AllInputs()) in->ResetValue();
    layer.enabled->ResetValue();
}

void MultiPoly::SetOrder(const std::vector<int> &order) {
    ScriptVal table = ScriptVal::Table();
    for (int n : order) table.Append(n);
    changingOrder_ = true;
    polyOrder_->SetValue(MakeRef<ScriptValue>(table));
    changingOrder_ = false;
}

void MultiPoly::RecordKinds() {
    ScriptVal ids = ScriptVal::Table();
    for (const auto &[n, layer] : layers_)
        if (layer.bspline) ids.Append(n);
    if (ids.Size())
        KeptFields().Set(kBSplineLayers, ids);
    else
        KeptFields().Remove(ScriptVal(kBSplineLayers));
}

void MultiPoly::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == polyOrder_ && !changingOrder_) {
        // The layers a new order names, made in ID order so that their inputs keep the order they were saved in.
        std::vector<int> ids = IDsOf(param);
        std::sort(ids.begin(), ids.end());
        std::vector<int> bsplines;
        if (const ScriptVal *kept = KeptFields().Find(kBSplineLayers); kept && kept->IsTable())
            bsplines = IDsOf(MakeRef<ScriptValue>(*kept).Get());
        for (int n : ids) EnsureLayer(n, std::find(bsplines.begin(), bsplines.end(), n) != bsplines.end());
    } else if ((in == addPolygon_ || in == addBSpline_) && Pressed(param)) {
        AddLayer(in == addBSpline_);
    } else {
        for (auto &[n, layer] : layers_) {
            if (in == layer.remove && Pressed(param)) {
                DeleteLayer(n); // `layer` is gone; `in` lives on detached
                break;
            }
            if (in == layer.reset && Pressed(param)) {
                ResetLayer(layer);
                break;
            }
            layer.poly->NotifyChanged(in, param);
        }
    }
    MaskOperator::NotifyChanged(in, param, time, tags);
}

std::vector<const MultiPoly::Layer *> MultiPoly::EnabledLayers(Request *req) const {
    std::vector<const Layer *> enabled;
    for (int n : IDsOf(req->GetInputData(polyOrder_))) {
        const auto it = layers_.find(n);
        if (it != layers_.end() && req->GetInputNumber(it->second.enabled, 1.0) >= 0.5) enabled.push_back(&it->second);
    }
    return enabled;
}

void MultiPoly::PreProcess(Request *req) {
    // The incoming mask, when there is one, is the accumulator: the tool's own image then needs no rows.
    const bool incoming = Common().effectMask && dynamic_cast<Image *>(req->GetInputData(Common().effectMask));
    ImgRectI region;
    if (const std::optional<ImgRectI> dod = GetMaskDoD(req); dod && !incoming) {
        const MaskFormat format = GetMaskFormat(req);
        // A layer in paint mode None never changes the stack.
        for (const Layer *layer : EnabledLayers(req))
            if (layer->poly->Controls().MergeSettings(req).paintMode != PaintNone)
                region |= layer->poly->PixelBox(req, format);
        region &= *dod;
    }
    SetMaskRegion(req, region);
    MaskOperator::PreProcess(req);
}

void MultiPoly::Process(Request *req) {
    Ref<Image> acc(GetMaskImage(req));
    SetMaskImage(req, nullptr);
    if (!acc) return;
    if (auto *incoming = Common().effectMask ? dynamic_cast<Image *>(req->GetInputData(Common().effectMask)) : nullptr)
        acc = Ref<Image>(incoming);
    const MaskFormat format = GetMaskFormat(req);
    const ImgRectI valid = GetMaskDoD(req).value_or(ImgRectI());
    const bool clipToFrame = GetClippingMode(req) == ClippingMode_Frame;
    for (const Layer *layer : EnabledLayers(req)) {
        MaskMergeSettings s = layer->poly->Controls().MergeSettings(req);
        s.clipToFrame = clipToFrame;
        const ImgRectI box = layer->poly->PixelBox(req, format);
        Ref<Image> mask = CreateMaskImage(req, {{MaskRegion, &box}, {MaskReach, SoftEdgeReach(s, format)}});
        SetMaskImage(req, nullptr);
        Ref<Image> merged;
        if (mask && layer->poly->Render(req, mask.Get(), format)) merged = MergeMasks(req, mask, acc.Get(), s, valid);
        if (req->GetTask() && req->GetTask()->IsAborted()) break;
        if (!merged) {
            ClearPixelRefusal(); // the line below says what went wrong
            if (GetDoc())
                GetDoc()->PrintF(ConsoleError, "%s cannot get mask image at time %g\n", Name().c_str(), req->Time());
            continue;
        }
        acc = merged;
    }
    SetMaskImage(req, acc);
}

} // namespace Orvane
