#include "operators/key/UltraKeyer.h"

#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/matte/MatteSteps.h"
#include "operators/filter/BlurControls.h"
#include "operators/frame/Registration.h"
#include "operators/warp/SizingCommon.h"

namespace Orvane {

static ClassRegistration<UltraKeyer, ThreadedOperator>
    s_Registration(CLSID_Operator_UltraKeyer, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "UltraKeyer"},
                    {RegPath, "Tools/Matte/UltraKeyer"},
                    {RegName, "Ultra Keyer"},
                    {RegCategory, "Matte"},
                    {RegAbbreviation, "UKy"},
                    {RegHelp, "Creates a matte from a Blue or Green Screen"},
                    {RegIcon, "Icons.Tools.Icons.UltraKeyer"},
                    {RegNoMotionBlurControls, 1},
                    {RegHasOperatorControl, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

/// The range inputs in the order of PreMatteRanges: low limits, then high.
constexpr const char *kRangeIds[8] = {"RedLow",  "GreenLow",  "BlueLow",  "LuminanceLow",
                                      "RedHigh", "GreenHigh", "BlueHigh", "LuminanceHigh"};

/// The pre-matte's blur: passes, and the level its alpha is cut at.
constexpr int kPreMattePasses = 2;
constexpr double kPreMatteLow = 0.8;

TagList Slider(double def, double low, double high, std::initializer_list<TagItem> more = {}) {
    TagList t{{LinkDataType, CLSID_DataType_Number},
              {InputControl, CLSID_InputControl_Slider},
              {InputDefault, def},
              {InputSliderLow, low},
              {InputSliderHigh, high}};
    for (const TagItem &item : more) t.Add(item);
    return t;
}

TagList Checkbox(double def, std::initializer_list<TagItem> more = {}) {
    TagList t{{LinkDataType, CLSID_DataType_Number},
              {InputControl, CLSID_InputControl_Checkbox},
              {InputDefault, def},
              {InputMinAllowed, 0.0},
              {InputMaxAllowed, 1.0}};
    for (const TagItem &item : more) t.Add(item);
    return t;
}

} // namespace

UltraKeyer::UltraKeyer(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags), matte_(*this, KeyerMatte::Flavour::Screen),
      picker_(*this, "LockColorPicking", kRangeIds, "UltraKeyer Pick") {
    AddControlPageTagList("PreMatte", {});
    static const char *const kColours[3] = {"Red", "Green", "Blue"};
    static const int kChannels[3] = {ColorChannelRed, ColorChannelGreen, ColorChannelBlue};
    for (int c = 0; c < 3; ++c) {
        const std::string name = std::string("Background ") + kColours[c];
        background_[c] = AddInputTagList(name.c_str(), ("Background" + std::string(kColours[c])).c_str(),
                                         {{LinkDataType, CLSID_DataType_Number},
                                          {InputControl, CLSID_InputControl_Color},
                                          {ControlGroup, 6},
                                          {ControlMember, c},
                                          {ColorChannel, kChannels[c]},
                                          {InputDefault, 0.5},
                                          {InputSliderLow, 0.0},
                                          {InputSliderHigh, 1.0},
                                          {LinkForceSave, 1},
                                          {InputNotify, 1}});
    }
    weight_[0] = AddInputTagList("Red Level", "Weight1",
                                 Slider(0.5, 0.0, 1.0, {{InputMinAllowed, 0.0}, {InputMaxAllowed, 1.0}}));
    weight_[1] = AddInputTagList("Green Level", "Weight2",
                                 Slider(0.5, 0.0, 1.0, {{InputMinAllowed, 0.0}, {InputMaxAllowed, 1.0}}));
    correction_ = AddInputTagList("Background Correction", "BackgroundCorrection",
                                  Slider(0.0, 0.0, 1.0, {{InputMinAllowed, 0.0}}));
    separation_ = AddInputTagList("Matte Separation", "MatteSeparation",
                                  Slider(0.0, 0.0, 1.0, {{InputMinAllowed, 0.0}, {InputMaxAllowed, 1.0}}));
    BeginControlNestTagList("Pre Matte Range", "PreMatteRangeNest", true, {});
    ranges_.Add(*this, kRangeIds, 1);
    EndControlNest();
    AddInputTagList("Lock Color Picking", "LockColorPicking", Checkbox(0.0, {{InputPassive, 1}}));
    preMatteSize_ =
        AddInputTagList("Pre Matte Size", "PreMatteSize",
                        Slider(0.0, 0.0, 50.0, {{SliderSteps, 51}, {InputMinAllowed, 0.0}, {InputMaxAllowed, 50.0}}));
    reset_ = AddButton(this, "Reset Pre Matte Ranges", "ResetPreMatteRanges");
    AddControlPageTagList("Image", {});
    matte_.AddImageInputs(false);
    AddControlPageTagList("Matte", {});
    matte_.AddMatteInputs();
    subtract_ = AddInputTagList("Subtract Background", "SubtractBackground", Checkbox(1.0));
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image},
                              {LinkMain, 1},
                              {InputPriority, PriorityImage},
                              {InputRequired, 1},
                              {ImageFromRequestOK, 1}});
    // Older flows connect their garbage matte here: the link moves to
    // Garbage.Mask as it is made (unless that has one), so it is saved there.
    legacyGarbage_ = AddInputTagList("LegacyGarbageMatte", "GarbageMatte",
                                     {{LinkDataType, CLSID_DataType_Mask},
                                      {InputPriority, PriorityMask},
                                      {LinkNotSaved, 1},
                                      {ControlVisible, 0},
                                      {InputNotify, 1},
                                      {InputInitialNotify, 0}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void UltraKeyer::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == reset_ && param) ranges_.Reset();
    if (in == legacyGarbage_ && in->Link()) {
        Output *link = in->Link();
        in->Disconnect();
        if (Input *garbage = FindInput("Garbage.Mask"); garbage && !garbage->Link()) garbage->ConnectTo(link);
    }
    matte_.NotifyChanged(in, param);
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void UltraKeyer::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() == input_->Priority()) matte_.CheckRequest(req, input_, AskInputNumber(req, preMatteSize_, 0.0));
}

UltraKeyer::Keying UltraKeyer::Read(Request *req) {
    auto num = [req](const Input *in, double def) { return req->GetInputNumber(in, def); };
    Keying k;
    k.matte = matte_.Read(req);
    UltraKeyerSettings s;
    for (int c = 0; c < 3; ++c) s.background[c] = num(background_[c], 0.5);
    s.weight1 = num(weight_[0], 0.5), s.weight2 = num(weight_[1], 0.5);
    s.backgroundCorrection = num(correction_, 0.0);
    s.matteSeparation = num(separation_, 0.0);
    s.subtractBackground = num(subtract_, 1.0) >= 0.5;
    k.values = DeriveUltraKeyerValues(s);
    k.matte.keyChannel = k.values.vlColor; // the spill is taken off the screen's channel
    ranges_.Read(req, k.ranges.low, k.ranges.high);
    k.preMatteSize = num(preMatteSize_, 0.0);
    k.device = IsGPUEnabled(req, true);
    return k;
}

Ref<Image> UltraKeyer::Key(Request *req, const Image *src, Ref<Image> dst, const Keying &k) const {
    const UltraKeyerValues &v = k.values;
    const KeyerMatte::Values &mv = k.matte;
    if (!DoSoftUltraKeyer(req, src, dst.Get(), v, k.device)) return {};
    // The work image: the pre-matte, then the soft matte Subtract compares with.
    const bool preMatte = !k.ranges.AtDefaults();
    Ref<Image> work;
    if (preMatte || v.sub) {
        const ImgRectI window = dst->DataWindow();
        work = NewImageTagList({{ImgLikeImage, dst.Get()},
                                {ImgDataWindow, &window},
                                {ImgTakeWindows, 1},
                                {ImgAbortFlag, dst->AbortFlag()}});
        if (!work) return {};
    }
    Image *w = work.Get();
    if (preMatte) {
        if (!DoUltraKeyer(req, src, w, k.ranges, k.device)) return {};
        if (k.preMatteSize > kKeyerNoChange &&
            !(MatteCore_DoSoftenChannel(req, w, MatteAlpha, k.preMatteSize, kPreMattePasses, BlurGaussian) &&
              KeyerMatte::LevelsOn(req, w, MatteAlpha, kPreMatteLow, 1.0, 0.0, 1.0)))
            return {};
        if (!DoCombine(req, w, dst.Get(), k.device)) return {};
    } else if (v.sub && !MatteCore_DoCopyChannel(req, dst.Get(), w, MatteAlpha, MatteAlpha)) {
        return {};
    }
    if (!KeyerMatte::BlurMatte(req, dst.Get(), mv) || !KeyerMatte::Levels(req, dst.Get(), mv)) return {};
    if (v.sub && !DoSubtract(req, src, dst.Get(), w, k.device)) return {};
    // A solid matte: the colour follows the alpha it gives; the alpha itself
    // is given with the other mattes below.
    bool inverted = false;
    if (const Image *solid = matte_.SolidMask(req, &inverted); solid && v.sub) {
        if (!MatteCore_DoCopyChannel(req, dst.Get(), w, MatteAlpha, MatteAlpha)) return {};
        dst = DoGarbageMatte(req, dst.Get(), solid, GarbageMatteSolid, false, inverted);
        if (!dst || !DoSubtract(req, src, dst.Get(), w, k.device) ||
            !MatteCore_DoCopyChannel(req, w, dst.Get(), MatteAlpha, MatteAlpha))
            return {};
    }
    if (!KeyerMatte::Spill(req, dst.Get(), mv) || !KeyerMatte::Fringe(req, dst.Get(), mv) ||
        !KeyerMatte::Invert(req, dst.Get(), mv))
        return {};
    dst = matte_.ApplyMasks(req, dst.Get());
    if (!dst) return {};
    if (!KeyerMatte::PostMultiply(req, dst.Get(), mv)) return {};
    return dst;
}

bool UltraKeyer::ControlCommand(int command, const TagList &tags) {
    if (command != CCMD_Select) return ThreadedOperator::ControlCommand(command, tags);
    return picker_.Select(tags);
}

void UltraKeyer::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const Keying k = Read(req);
    if (!req->IsPreCalc()) picker_.Apply(*src, 0, k.ranges.low, k.ranges.high);
    Ref<Image> dst = matte_.NewMatteImage(req, input_, src, k.matte, k.preMatteSize);
    if (dst && dst->IsMask()) { // a one-channel source keys as grey: the result needs colour
        const ImgRectI window = dst->DataWindow(), valid = dst->ValidWindow();
        dst = NewImageTagList({{ImgLikeImage, dst.Get()},
                               {ImgDepth, dst->Depth() + (DepthRGBAInt8 - DepthAInt8)},
                               {ImgDataWindow, &window},
                               {ImgValidWindow, &valid},
                               {ImgNoData, req->IsPreCalc()},
                               {ImgTakeWindows, 1}});
    }
    Ref<Image> out = dst;
    if (dst && !dst->IsNoData() && !dst->DataWindow().IsNull()) out = Key(req, src, dst, k);
    const bool aborted = dst && dst->CheckAbort();
    if (!out || aborted) {
        if (!aborted) FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    out->CopyCanvasColor(src);
    req->SetOutputData(output_, out.Get());
}

} // namespace Orvane
