#include "operators/composite/Switch.h"

#include <algorithm>
#include <cmath>
#include <memory>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_SwitchBase("SwitchBase");
static const OvID CLSID_Switch("Switch");
static const OvID CLSID_Switch3D("Switch3D");
static const OvID CLSID_MtlSwitch3D("MtlSwitch3D");

namespace {

constexpr uint32_t kVarInputs = RegKindOperator | RegKindTool | RegKindVariableInputs;

} // namespace

// The abstract base has a row of its own, without a constructor, so that the
// three switches resolve their base in the registry.
static RegistrationBase s_SwitchBase(CLSID_SwitchBase, &CLSID_ThreadedOperator, nullptr, &SwitchBase::RegInit,
                                     &SwitchBase::RegCleanup,
                                     std::make_unique<ScriptInfoT<SwitchBase>>(1, CLSID_SwitchBase.Text(), "", ""),
                                     typeid(SwitchBase), typeid(ThreadedOperator), {{RegTypeFlags, 0}});

static ClassRegistration<Switch, SwitchBase> s_Switch(CLSID_Switch, &CLSID_SwitchBase,
                                                      {{RegTypeFlags, static_cast<long long>(kVarInputs)},
                                                       {RegPath, "Tools/Composite/Switch"},
                                                       {RegName, "Switch"},
                                                       {RegCategory, "Composite"},
                                                       {RegAbbreviation, "Sw"},
                                                       {RegHelp, "Switchs between multiple image inputs"},
                                                       {RegIcon, "Icons.Tools.Icons.Switch"},
                                                       {RegNoBlendControls, 1},
                                                       {RegNoEffectMask, 1},
                                                       {RegNoObjectMaterialControls, 1},
                                                       {RegNoMotionBlurControls, 1},
                                                       {RegSupportsRoI, 1},
                                                       {RegSupportsDoD, 1},
                                                       {RegSwitchClass, 1},
                                                       {RegSwitchDataKind, 0},
                                                       {RegSupportsGPUImages, 1}});

static ClassRegistration<Switch3D, SwitchBase>
    s_Switch3D(CLSID_Switch3D, &CLSID_SwitchBase,
               {{RegTypeFlags, static_cast<long long>(kVarInputs | RegKind3D)},
                {RegPath, "Tools/3D/Switch"},
                {RegName, "Switch3D"},
                {RegCategory, "3D"},
                {RegAbbreviation, "3Sw"},
                {RegHelp, "Switchs between multiple 3D inputs"},
                {RegIcon, "Icons.Tools.Icons.Switch3D"},
                {RegNoBlendControls, 1},
                {RegNoEffectMask, 1},
                {RegNoObjectMaterialControls, 1},
                {RegNoMotionBlurControls, 1},
                {RegHidden, 1},
                {RegSupportsRoI, 1},
                {RegSupportsDoD, 1},
                {RegSwitchClass, 1},
                {RegSwitchDataKind, 1}});

static ClassRegistration<MtlSwitch3D, SwitchBase>
    s_MtlSwitch3D(CLSID_MtlSwitch3D, &CLSID_SwitchBase,
                  {{RegTypeFlags, static_cast<long long>(RegFamilyMaterial | kVarInputs | RegKind3D)},
                   {RegPath, "Tools/3D/Material/Switch"},
                   {RegName, "Material Switch"},
                   {RegCategory, "3D\\Material"},
                   {RegAbbreviation, "3MSw"},
                   {RegHelp, "Switchs between multiple materials"},
                   {RegIcon, "Icons.Tools.Icons.MtlSwitch3D"},
                   {RegNoBlendControls, 1},
                   {RegNoEffectMask, 1},
                   {RegNoObjectMaterialControls, 1},
                   {RegNoMotionBlurControls, 1},
                   {RegHidden, 1},
                   {RegSupportsRoI, 1},
                   {RegSupportsDoD, 1},
                   {RegSwitchClass, 1},
                   {RegSwitchDataKind, 2}});

namespace {

/// The number an input holds for this request, rounded to the nearest whole
/// number (halves up).
int Rounded(const Request *req, const Input *in, double fallback) {
    return static_cast<int>(std::floor(req->GetInputNumber(in, fallback) + 0.5));
}

constexpr int kDefaultInputs = 2;
constexpr double kMostInputs = 256.0;

} // namespace

SwitchBase::SwitchBase(const Registry *reg, const ScriptVal &args, const TagList &tags, OvID dataType)
    : ThreadedOperator(reg, args, tags), dataType_(dataType) {
    AddControlPageTagList("Controls", {});
    // Fetched before the inputs it chooses among, so CheckRequest knows it.
    source_ = AddInputTagList("Source", "Source",
                              {{LinkDataType, CLSID_DataType_Number},
                               {InputControl, CLSID_InputControl_Combo},
                               {InputPriority, PriorityImage - 1},
                               {InputDefault, 0.0}});
    configPage_ = AddControlPageTagList("Config", {});
    numberOfInputs_ = AddInputTagList("Number of Inputs", "NumberOfInputs",
                                      {{LinkDataType, CLSID_DataType_Number},
                                       {InputControl, CLSID_InputControl_Slider},
                                       {ControlPage, configPage_},
                                       {InputInteger, 1},
                                       {InputMinAllowed, 1.0},
                                       {InputMaxAllowed, kMostInputs},
                                       {InputSliderLow, 1.0},
                                       {InputSliderHigh, 16.0},
                                       {InputDefault, static_cast<double>(kDefaultInputs)},
                                       {InputExternal, 0},
                                       {InputNotify, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, dataType_}, {LinkMain, 1}});
    SetCount(kDefaultInputs);
}

void SwitchBase::SetCount(int count) {
    count = std::clamp(count, 1, static_cast<int>(kMostInputs));
    while (Positions() < count) {
        const int i = Positions();
        const std::string id = "Input" + std::to_string(i), nameId = "Name" + std::to_string(i);
        const std::string label = "Input " + std::to_string(i), nameLabel = "Name " + std::to_string(i);
        TagList linkTags{{LinkDataType, dataType_}, {LinkMain, i + 1}, {InputRequired, 0}, {InputNotify, 1}};
        if (dataType_ == CLSID_DataType_Image) {
            // A pending transform passes through unflattened.
            linkTags.Add({LinkSecondDataType, CLSID_DataType_TransformMatrix});
            linkTags.Add({ImageFromRequestOK, 1});
        }
        Input *input = AddInputTagList(label.c_str(), id.c_str(), linkTags);
        Input *name = AddInputTagList(nameLabel.c_str(), nameId.c_str(),
                                      {{LinkDataType, CLSID_DataType_Text},
                                       {InputControl, CLSID_InputControl_TextEdit},
                                       {ControlPage, configPage_},
                                       {InputExternal, 0},
                                       {InputPassive, 1},
                                       {InputNotify, 1}});
        if (!input || !name) break; // the tool already has inputs of these IDs
        positions_.push_back({input, name});
    }
    shown_ = count;
    for (int i = 0; i < Positions(); ++i) {
        const long long visible = i < count ? 1 : 0;
        if (positions_[i].input->Tags().GetLong(ControlVisible, 1) == visible) continue;
        positions_[i].input->SetAttrsTagList({{ControlVisible, visible}});
        positions_[i].name->SetAttrsTagList({{ControlVisible, visible}});
    }
    NameSources();
}

void SwitchBase::NameSources() {
    std::vector<std::string> labels;
    for (int i = 0; i < std::min(shown_, Positions()); ++i) {
        const auto *name = dynamic_cast<const Text *>(positions_[i].name->Constant().Get());
        const Output *link = positions_[i].input->Link();
        labels.push_back(name && !name->value.empty() ? name->value
                         : link                       ? link->Owner()->Name()
                                                      : "Input " + std::to_string(i));
    }
    source_->SetChoices(labels);
}

void SwitchBase::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == numberOfInputs_) {
        if (const auto *n = dynamic_cast<const Number *>(param)) SetCount(static_cast<int>(std::floor(n->value + 0.5)));
    } else if (in != source_ && source_) {
        NameSources(); // a position's name or link
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void SwitchBase::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (positions_.empty() || req->GetPri() != positions_.front().input->Priority() ||
        (req->GetFlags() & ReqFlagSkipRoI))
        return;
    const int chosen = Rounded(req, source_, 0.0);
    for (int i = 0; i < Positions(); ++i)
        if (i != chosen) req->SetInputData(positions_[i].input, nullptr);
}

void SwitchBase::Process(Request *req) {
    const int chosen = Rounded(req, source_, 0.0);
    const int count = std::min(Rounded(req, numberOfInputs_, kDefaultInputs), Positions());
    if (chosen < 0 || chosen >= count) {
        Fail(req,
             "%s failed at time %.1f - the switch tool tried to switch to a non-existant input %i (currently inputs "
             "only exist for the range [%i, %i])",
             Name().c_str(), req->Time(), chosen, 0, count - 1);
        req->SetOutputData(output_, nullptr);
        return;
    }
    Input *in = positions_[chosen].input;
    Parameter *value = req->GetInputData(in);
    if (!value) {
        // Unlinked: caught by the pre-calculation of image switches; the 3D
        // switches have none, so they say the same in their only pass.
        if (!in->Link())
            Fail(req, "%s.%s failed at time %.1f - unconnected input\n", Name().c_str(), in->ID().Text(), req->Time());
        else
            Fail(req, "%s.%s failed at time %.1f - unable to get parameter\n", Name().c_str(), in->ID().Text(),
                 req->Time());
        req->SetOutputData(output_, nullptr);
        return;
    }
    req->SetOutputData(output_, value); // the request takes one more reference
}

Switch::Switch(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : SwitchBase(reg, args, tags, CLSID_DataType_Image) {}

Switch3D::Switch3D(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : SwitchBase(reg, args, tags, CLSID_DataType_3D) {}

MtlSwitch3D::MtlSwitch3D(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : SwitchBase(reg, args, tags, CLSID_DataType_MtlGraph3D) {}

} // namespace Orvane
