#include "operators/composite/Merge.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/image/TransformMatrix.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Merge("Merge");
static ClassRegistration<Merge, ThreadedOperator>
    s_Registration(CLSID_Merge, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindTwoImage},
                    {RegPath, "Tools/Composite/Merge"},
                    {RegName, "Merge"},
                    {RegCategory, "Composite"},
                    {RegAbbreviation, "Mrg"},
                    {RegHelp, "Layers one image over another, with rotation, scaling and offset"},
                    {RegIcon, "Icons.Tools.Icons.Merge"},
                    {RegAlias, "ZMerge"},
                    {RegSortOrder, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

Merge::Merge(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
    background_ = AddInputTagList("Background", "Background",
                                  {{LinkDataType, CLSID_DataType_Image},
                                   {LinkSecondDataType, CLSID_DataType_TransformMatrix},
                                   {LinkMain, 1},
                                   {InputNotify, 1},
                                   {InputInitialNotify, 0},
                                   {ImageFromRequestOK, 1},
                                   {ImageBackground, 1}});
    foreground_ = AddInputTagList("Foreground", "Foreground",
                                  {{LinkDataType, CLSID_DataType_Image},
                                   {LinkSecondDataType, CLSID_DataType_TransformMatrix},
                                   {LinkMain, 2},
                                   {InputRequired, 0},
                                   {ImageFromRequestOK, 1},
                                   {ImageForeground, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    const int page = AddControlPageTagList("Merge", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Merge")}});
    AddControlPageTagList("Channels", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Channels")}});
    merge_ = std::make_unique<MergeInputs>(this, foreground_);

    // The reference size, back on the Merge page.
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    BeginControlNestTagList("Reference Size", "ReferenceSize", false, {{ControlPage, page}});
    auto side = [&](const char *name, int def) {
        return AddInputTagList(name, name,
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Slider},
                                {ControlPage, page},
                                {InputInteger, 1},
                                {InputMinAllowed, 1.0},
                                {InputSliderHigh, 2048.0},
                                {InputMaxAllowed, 32767.0},
                                {SliderSteps, 2047},
                                {InputDefault, static_cast<double>(def)},
                                {InputDelayDefault, 1},
                                {InputExternal, 0},
                                {InputNotify, 1},
                                {InputPassive, 1}});
    };
    width_ = side("Width", ff.width);
    height_ = side("Height", ff.height);
    useFrameFormat_ = AddInputTagList("Use Frame Format Settings", "UseFrameFormatSettings",
                                      {{LinkDataType, CLSID_DataType_Number},
                                       {InputControl, CLSID_InputControl_Checkbox},
                                       {ControlPage, page},
                                       {InputDefault, 0.0},
                                       {InputExternal, 0},
                                       {InputNotify, 1},
                                       {InputPassive, 1}});
    EndControlNest();
    merge_->SetReferenceSize(width_, height_);
}

Merge::~Merge() = default;

void Merge::FollowFrameFormat() {
    if (!GetDoc()) return;
    const long w = GetDoc()->GetPrefLong(PREF_FFWidth), h = GetDoc()->GetPrefLong(PREF_FFHeight);
    auto follow = [](Input *in, long v) {
        const auto *n = dynamic_cast<const Number *>(in->Constant().Get());
        if (!n || n->value != static_cast<double>(v)) in->SetValue(MakeRef<Number>(static_cast<double>(v)));
    };
    follow(width_, w);
    follow(height_, h);
}

void Merge::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == useFrameFormat_) {
        if (const auto *n = dynamic_cast<const Number *>(param)) {
            const bool on = n->value >= 0.5;
            width_->SetAttrsTagList({{ControlVisible, on ? 0 : 1}});
            height_->SetAttrsTagList({{ControlVisible, on ? 0 : 1}});
            if (on) FollowFrameFormat();
        }
    }
    merge_->NotifyChanged(in, param, time);
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void Merge::Process(Request *req) {
    // The Background's own pending transform carries on through the merge.
    Ref<TransformMatrix> result =
        MakeRef<TransformMatrix>(req->GetInputData(background_), req, background_, 0u, TimeUndefined);
    if (!result->IsValid() || !merge_->Merge(req, result.Get(), TagList())) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    req->SetOutputData(output_, result.Get());
}

} // namespace Orvane
