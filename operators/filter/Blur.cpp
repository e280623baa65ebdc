#include "operators/filter/Blur.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <iterator>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "operators/filter/BlurControls.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Blur("Blur");
static ClassRegistration<Blur, ThreadedOperator> s_Registration(CLSID_Blur, &CLSID_ThreadedOperator,
                                                                {{RegTypeFlags, RegKindOperator | RegKindTool},
                                                                 {RegClassName, "Blur"},
                                                                 {RegPath, "Tools/Blur/Blur"},
                                                                 {RegName, "Blur"},
                                                                 {RegCategory, "Blur"},
                                                                 {RegAbbreviation, "Blur"},
                                                                 {RegHelp, "Blurs images"},
                                                                 {RegIcon, "Icons.Tools.Icons.Blur"},
                                                                 {RegNoMotionBlurControls, 1},
                                                                 {RegSupportsRoI, 1},
                                                                 {RegSupportsDoD, 1},
                                                                 {RegSupportsGPUImages, 1}});

namespace {

/// Sizes below this (2^-23) on both axes leave nothing to do.
constexpr double kNoSize = 1.1920928955078125e-7;
/// Control values are lengths on a 720-wide frame.
constexpr double kSizeUnit = 720.0;

} // namespace

int Blur::FilterType(OvID id) { return BlurTypeOfFilter(id); }

Blur::Blur(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Blur")}});

    filter_ = AddInputTagList("Filter", "Filter", BlurFilterTags());

    // The channel buttons: one row (control group 12) under a blank heading.
    const char *const names[4] = {"Red", "Green", "Blue", "Alpha"};
    const char *const icons[4] = {"Controls.MultiButton.Icons.Red", "Controls.MultiButton.Icons.Green",
                                  "Controls.MultiButton.Icons.Blue", "Controls.MultiButton.Icons.Alpha"};
    for (int c = 0; c < 4; ++c) {
        TagList button{{LinkDataType, CLSID_DataType_Number},
                       {InputControl, CLSID_InputControl_MultiButton},
                       {ControlGroup, 12},
                       {ControlMember, c},
                       {InputDefault, 1.0},
                       {InputMinAllowed, 0.0},
                       {InputMaxAllowed, 1.0},
                       {ButtonIcon, icons[c]}};
        if (c == 0) button.Set({ControlLabel, ""});
        channel_[c] = AddInputTagList(names[c], names[c], button);
    }

    lockXY_ = AddInputTagList("Lock X/Y", "LockXY",
                              {{LinkDataType, CLSID_DataType_Number},
                               {InputControl, CLSID_InputControl_Checkbox},
                               {InputDefault, 1.0},
                               {InputMinAllowed, 0.0},
                               {InputMaxAllowed, 1.0},
                               {InputExternal, 0},
                               {InputNotify, 1}});
    const TagList size{{LinkDataType, CLSID_DataType_Number},
                       {InputControl, CLSID_InputControl_Slider},
                       {InputDefault, 1.0},
                       {InputMinAllowed, 0.0},
                       {InputSliderLow, 0.0},
                       {InputSliderHigh, 100.0},
                       {SliderSteps, 101},
                       {InputSendRequest, 0}};
    xSize_ = AddInputTagList("X Blur Size", "XBlurSize", size);
    ySize_ = AddInputTagList("Y Blur Size", "YBlurSize", size);
    passes_ = AddInputTagList("Num Passes", "Passes", BlurPassesTags());
    clipping_ = AddInputTagList("Clipping Mode", "ClippingMode", ClippingModeTags(ClippingMode_Frame));
    // The common Blend shown on this page: the host cannot clone an input, so
    // this is an input of its own with the same description (see Blur.h).
    blendClone_ = AddInputTagList("Blend", "BlendClone",
                                  {{LinkDataType, CLSID_DataType_Number},
                                   {InputControl, CLSID_InputControl_Slider},
                                   {InputDefault, 1.0},
                                   {InputMinAllowed, 0.0},
                                   {InputMaxAllowed, 1.0},
                                   {SliderSteps, 101}});
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image},
                              {LinkMain, 1},
                              {InputPriority, PriorityImage},
                              {InputRequired, 1},
                              {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});

    // Settings of old documents: "Soften" was a filter of its own, now Multi-box.
    const Ref<Parameter> old = filter_->ValueAt(TimeUndefined);
    if (const auto *id = dynamic_cast<const IDValue *>(old.Get()); id && id->value == OvID("Soften"))
        filter_->SetValue(MakeRef<IDValue>(OvID("Multi-box")));
}

void Blur::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (param) {
        if (in == lockXY_) {
            if (const auto *n = dynamic_cast<const Number *>(param)) {
                const bool locked = n->value >= 0.5;
                ySize_->SetAttrsTagList({{ControlVisible, !locked}});
                xSize_->SetAttrsTagList({{ControlLabel, locked ? "Blur Size" : "X Blur Size"}});
            }
        } else if (in == filter_) {
            if (const auto *id = dynamic_cast<const IDValue *>(param))
                passes_->SetAttrsTagList({{ControlVisible, id->value == OvID("Multi-box")}});
        }
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

double Blur::AskNumber(Request *req, Input *in) const {
    return AskInputNumber(req, in, req->GetInputNumber(in, 0.0)); // the default
}

OvID Blur::AskID(Request *req, Input *in) const { return AskInputID(req, in, req->GetInputID(in)); }

Blur::Sizes Blur::ReadSizes(Request *req) const {
    Sizes s;
    s.x = AskNumber(req, xSize_) / kSizeUnit;
    s.y = AskNumber(req, lockXY_) >= 0.5 ? s.x : AskNumber(req, ySize_) / kSizeUnit;
    s.passes = static_cast<int>(std::floor(AskNumber(req, passes_) + 0.5));
    return s;
}

void Blur::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != input_->Priority() || (req->GetFlags() & ReqFlagSkipRoI)) return;
    const AutoImageDoD inDoD(req, input_), outDoD(req);
    if (!inDoD || !outDoD) return;
    const int type = FilterType(AskID(req, filter_));
    const Sizes s = ReadSizes(req);
    double x = s.x, y = s.y;
    if (!Image::GetBlurSupport(type, inDoD.Get(), x, y, s.passes)) {
        req->SetInputRoI(input_, nullptr); // a pixel may read the whole input
        return;
    }
    const AutoImageRoI roi(req);
    const ImageDomain &around = roi ? *roi.Get() : *outDoD.Get();
    ImageDomain region = around.WithRect(
        GrownKeepingEndless(around.rect, static_cast<int>(std::ceil(x)), static_cast<int>(std::ceil(y))));
    const OvID mode = AskID(req, clipping_);
    if (mode == ClippingMode_Domain)
        region.ClipTo(inDoD->rect);
    else if (mode == ClippingMode_Frame && inDoD->HasFrame())
        region.ClipTo(inDoD->frame);
    req->SetInputRoI(input_, &region);
}

void Blur::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const Sizes s = ReadSizes(req);
    const ImgRectI &dw = src->DataWindow();
    if ((s.x < kNoSize && s.y < kNoSize) || dw.Width() <= 0 || dw.Height() <= 0) {
        req->SetOutputData(output_, src); // nothing to do: the input itself
        return;
    }
    const int type = FilterType(req->GetInputID(filter_));
    const OvID mode = req->GetInputID(clipping_, ClippingMode_Frame);
    const bool precalc = req->IsPreCalc();
    const AutoImageRoI roi(req);
    const AutoImageDoD inDoD(req, input_);
    const ImgRectI domain = inDoD ? inDoD->rect : dw, frame = src->Frame();

    ImgRectI outWindow = precalc ? domain : frame;
    ImgRectI sourceWindow = mode == ClippingMode_Frame ? frame : domain;
    double x = s.x, y = s.y;
    if (src->GetBlurSupport(type, x, y, s.passes)) {
        outWindow = (precalc ? domain : dw).Grown(static_cast<int>(std::ceil(x)), static_cast<int>(std::ceil(y)));
        if (mode == ClippingMode_None) sourceWindow = outWindow;
        if (roi) outWindow &= roi->rect;
        if (mode == ClippingMode_Domain)
            outWindow &= domain;
        else if (mode == ClippingMode_Frame)
            outWindow &= frame;
    }
    const bool gpu = IsGPUEnabled(req, false);
    Ref<Image> out = NewImageTagList({{ImgLikeImage, src},
                                      {ImgDataWindow, &outWindow},
                                      {ImgValidWindow, roi ? &roi->rect : nullptr},
                                      {ImgNoData, precalc},
                                      {ImgTakeWindows, 1},
                                      {ImgForRequest, 1}});
    if (!out) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    // The host mixes by the blend (Blur.h): the common Blend too, unless the
    // mask multiplies first.
    const bool maskFirst = req->GetInputNumber(Common().multiplyByMask, 0.0) >= 0.5;
    const double blend =
        req->GetInputNumber(blendClone_, 1.0) * (maskFirst ? 1.0 : req->GetInputNumber(Common().blend, 1.0));
    src->BlurTagList(out.Get(), {{BlurFilterType, type},
                                 {BlurDoRed, req->GetInputNumber(channel_[0], 1.0) >= 0.5},
                                 {BlurDoGreen, req->GetInputNumber(channel_[1], 1.0) >= 0.5},
                                 {BlurDoBlue, req->GetInputNumber(channel_[2], 1.0) >= 0.5},
                                 {BlurDoAlpha, req->GetInputNumber(channel_[3], 1.0) >= 0.5},
                                 {BlurXSize, s.x},
                                 {BlurYSize, s.y},
                                 {BlurBlend, blend},
                                 {BlurScale, 1.0},
                                 {BlurPasses, s.passes},
                                 {BlurSourceWindow, &sourceWindow},
                                 {WorkOperator, static_cast<Operator *>(this)},
                                 {WorkThreaded, 1},
                                 {WorkUseGPU, gpu},
                                 {WorkRequest, req}});
    req->SetOutputData(output_, out.Get());
}

void Blur::PostProcess(Request *req) {
    Input *blend = Common().blend;
    if (!blend || req->GetInputNumber(Common().multiplyByMask, 0.0) >= 0.5) {
        ThreadedOperator::PostProcess(req);
        return;
    }
    // The blur has mixed by Blend already: the common mix runs with Blend 1.
    const Ref<Parameter> value(req->GetInputData(blend));
    req->SetInputData(blend, MakeRef<Number>(1.0).Get());
    ThreadedOperator::PostProcess(req);
    req->SetInputData(blend, value.Get());
}

} // namespace Orvane
