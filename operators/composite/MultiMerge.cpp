#include "operators/composite/MultiMerge.h"

#include <algorithm>
#include <cmath>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputValue.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/TransformMatrix.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_MultiMerge("MultiMerge");
static ClassRegistration<MultiMerge, ThreadedOperator>
    s_Registration(CLSID_MultiMerge, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindVariableInputs},
                    {RegPath, "Tools/Composite/MultiMerge"},
                    {RegName, "MultiMerge"},
                    {RegCategory, "Composite"},
                    {RegAbbreviation, "MMrg"},
                    {RegHelp, "Multi-input Merge"},
                    {RegIcon, "Icons.Tools.Icons.MultiMerge"},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace multimerge {

/// The layer numbers of a LayerOrder value, in table order; entries that
/// are not numbers above 0 are left out.
std::vector<int> NumbersOf(const Parameter *value) {
    std::vector<int> order;
    const auto *table = dynamic_cast<const ScriptValue *>(value);
    if (!table || !table->value.IsTable()) return order;
    for (const auto &[key, v] : table->value.Entries()) {
        if (!v.IsNumber()) continue;
        const int n = static_cast<int>(std::floor(v.AsNumber() + 0.5));
        if (n > 0) order.push_back(n);
    }
    return order;
}

bool On(double v) { return std::floor(v + 0.5) != 0.0; }

} // namespace multimerge

MultiMerge::MultiMerge(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    const int listPage = AddControlPageTagList("Layer List", {});
    auto list = [&](const char *name, const char *id, bool passive) {
        return AddInputTagList(name, id,
                               {{LinkDataType, CLSID_DataType_ScriptVal},
                                {InputControl, CLSID_InputControl_CheckList},
                                {ControlPage, listPage},
                                {InputExternal, 0},
                                {InputNotify, 1},
                                {InputPassive, passive}});
    };
    layerOrder_ = list("Layer Order", "LayerOrder", false);
    layerSelection_ = list("Layer Selection", "LayerSelection", true); // what the list shows selected
    background_ = AddInputTagList("Background", "Background",
                                  {{LinkDataType, CLSID_DataType_Image},
                                   {LinkSecondDataType, CLSID_DataType_TransformMatrix},
                                   {LinkMain, 1},
                                   {ImageFromRequestOK, 1},
                                   {ImageBackground, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    page_ = AddControlPageTagList("Merge", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Merge")}});
    EnsureLayer(1);
}

MultiMerge::~MultiMerge() = default;

MultiMerge::Layer *MultiMerge::EnsureLayer(int n) {
    if (n <= 0) return nullptr;
    if (auto it = layers_.find(n); it != layers_.end()) return &it->second;
    Layer layer;
    layer.number = n;
    const std::string num = std::to_string(n);
    SetCurrentGroup("Layer" + num);
    layer.merge = std::make_unique<MergeInputs>(this, nullptr, n + 1);
    SetCurrentGroup("");
    layer.foreground = layer.merge->ForegroundInput();
    if (layer.foreground) {
        TagList extra{{InputNotify, 1}, {InputInitialNotify, 0}};
        if (GetDoc() && GetDoc()->GetPrefLong(PREF_ImageOverlay) != 0)
            extra.Set({PreviewControl, CLSID_PreviewControlBase});
        layer.foreground->SetAttrsTagList(extra);
    }
    const std::string label = "Layer " + num;
    layer.name = AddInputTagList((label + " Name").c_str(), ("LayerName" + num).c_str(),
                                 {{LinkDataType, CLSID_DataType_Text},
                                  {InputControl, CLSID_InputControl_TextEdit},
                                  {ControlPage, page_},
                                  {InputDefaultText, label.c_str()},
                                  {InputExternal, 0}});
    layer.enabled = AddInputTagList((label + " Enabled").c_str(), ("LayerEnabled" + num).c_str(),
                                    {{LinkDataType, CLSID_DataType_Number},
                                     {InputControl, CLSID_InputControl_Checkbox},
                                     {ControlPage, page_},
                                     {InputDefault, 1.0}});
    auto button = [&](const char *what, const char *id) {
        return AddInputTagList((what + (" " + label)).c_str(), (id + num).c_str(),
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Button},
                                {ControlPage, page_},
                                {InputExternal, 0},
                                {InputNotify, 1},
                                {InputInitialNotify, 0},
                                {InputPassive, 1}});
    };
    layer.remove = button("Delete", "LayerDelete");
    layer.reset = button("Reset", "LayerReset");
    Layer &made = layers_.emplace(n, std::move(layer)).first->second;
    TakeKeptInputs(made);
    return &made;
}

void MultiMerge::TakeKeptInputs(const Layer &layer) {
    if (!GetDoc() || KeptInputs().Size() == 0) return;
    std::vector<Input *> inputs = layer.merge->AllInputs();
    for (Input *in : {layer.name, layer.enabled, layer.remove, layer.reset}) inputs.push_back(in);
    for (Input *in : inputs) {
        if (!in) continue;
        const ScriptVal key(in->ID().Text());
        const ScriptVal *kept = KeptInputs().Find(key);
        if (!kept) continue;
        const ScriptVal value = *kept;
        if (ApplyInputValue(*GetDoc(), in, value, {.keepUnknownLinks = true}).empty()) KeptInputs().Remove(key);
    }
}

std::vector<int> MultiMerge::LayerOrder() const { return multimerge::NumbersOf(layerOrder_->Constant().Get()); }

void MultiMerge::SetLayerOrder(const std::vector<int> &order) {
    ScriptVal table = ScriptVal::Table();
    for (int n : order) table.Append(n);
    layerOrder_->SetValue(MakeRef<ScriptValue>(table));
}

void MultiMerge::KeepEmptyLayer() {
    int last = 0;
    for (const auto &[n, layer] : layers_) {
        last = std::max(last, n);
        if (layer.foreground && !layer.foreground->Link()) return; // one is free
    }
    EnsureLayer(last + 1);
}

void MultiMerge::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == layerOrder_ && !changingOrder_) {
        for (int n : multimerge::NumbersOf(param)) EnsureLayer(n);
        KeepEmptyLayer();
    }
    for (auto &[n, layer] : layers_) {
        if (in == layer.foreground && in->Link()) {
            // A new source: the layer joins the order and takes its name.
            std::vector<int> order = LayerOrder();
            if (std::find(order.begin(), order.end(), n) == order.end()) {
                order.push_back(n);
                changingOrder_ = true;
                SetLayerOrder(order);
                changingOrder_ = false;
            }
            if (layer.name->IsDefault() && in->Link()->Owner())
                layer.name->SetValue(MakeRef<Text>(in->Link()->Owner()->Name() + " Layer"));
            KeepEmptyLayer();
            break;
        }
        if (in == layer.remove && param) {
            std::vector<int> order = LayerOrder();
            order.erase(std::remove(order.begin(), order.end(), n), order.end());
            layer.foreground->Disconnect();
            changingOrder_ = true;
            SetLayerOrder(order);
            changingOrder_ = false;
            break;
        }
        if (in == layer.reset && param) {
            for (Input *i : layer.merge->AllInputs())
                if (i != layer.foreground) i->ResetValue();
            break;
        }
        layer.merge->NotifyChanged(in, param, time);
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

bool MultiMerge::LayerTakesPart(const Layer &layer, double time) const {
    if (!layer.foreground || !layer.enabled || layer.foreground == background_) return false;
    const Ref<Parameter> v = layer.enabled->ValueAt(time);
    const auto *n = dynamic_cast<const Number *>(v.Get());
    return !n || multimerge::On(n->value); // a linked switch is read after it is fetched
}

void MultiMerge::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != PriorityImage) return;
    // Layers that will not be merged are not rendered.
    const std::vector<int> order = multimerge::NumbersOf(layerOrder_->ValueAt(req->Time()).Get());
    for (const auto &[n, layer] : layers_) {
        const bool listed = std::find(order.begin(), order.end(), n) != order.end();
        if (layer.foreground && (!listed || !LayerTakesPart(layer, req->Time())))
            req->SetInputData(layer.foreground, nullptr);
    }
}

void MultiMerge::Process(Request *req) {
    blendedHere_ = false;
    Parameter *bgValue = req->GetInputData(background_);
    Ref<TransformMatrix> stack = MakeRef<TransformMatrix>(bgValue, req, background_, 0u, TimeUndefined);
    if (!stack->IsValid()) {
        Fail(req, "%s: the background is not an image (time = %g)\n", Name().c_str(), req->Time());
        req->SetOutputData(output_, nullptr);
        return;
    }
    for (int n : multimerge::NumbersOf(req->GetInputData(layerOrder_))) {
        auto it = layers_.find(n);
        if (it == layers_.end()) continue;
        Layer &layer = it->second;
        if (!layer.foreground || !layer.enabled || layer.foreground == background_) continue;
        if (!req->GetInputData(layer.foreground)) continue; // not connected, or left out by CheckRequest
        if (!multimerge::On(req->GetInputNumber(layer.enabled, 1.0))) continue;
        if (layer.merge) layer.merge->Merge(req, stack.Get(), TagList()); // a failing layer says so and is passed over
    }

    const double blend = req->GetInputNumber(Common().blend, 1.0);
    const bool masked = Common().effectMask && req->GetInputData(Common().effectMask);
    if (blend == 1.0 || masked) {
        // The short way; a mask is the host's common mix to apply.
        req->SetOutputData(output_, stack.Get());
        return;
    }
    // The stack back over the unmerged Background with the Blend.
    Ref<TransformMatrix> blended = MakeRef<TransformMatrix>(bgValue, req, background_, 0u, TimeUndefined);
    if (!blended->MergeConcatenateTagList(stack.Get(),
                                          {{XfMergeToolBlend, -1}, {XfRequest, static_cast<const void *>(req)}})) {
        if (!(req->GetTask() && req->GetTask()->IsAborted())) FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    blendedHere_ = true;
    req->SetOutputData(output_, blended.Get());
}

void MultiMerge::PostProcess(Request *req) {
    if (blendedHere_) return; // Blend and the Process switches are in the result already
    ThreadedOperator::PostProcess(req);
}

} // namespace Orvane
