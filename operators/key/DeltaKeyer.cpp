#include "operators/key/DeltaKeyer.h"

#include <algorithm>
#include <cmath>
#include <string>

#include "host/color/ColorCurvesTable.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputValue.h"
#include "host/flow/Link.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/flow/ToolFrame.h"
#include "host/image/BlurFilters.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/matte/MaskInputs.h"
#include "host/matte/MatteSteps.h"
#include "operators/frame/IdChoices.h"
#include "operators/frame/Registration.h"
#include "operators/key/DeltaKeyerSteps.h"
#include "operators/warp/SizingCommon.h"

namespace Orvane {

static const OvID CLSID_DeltaKeyer("DeltaKeyer");
static ClassRegistration<DeltaKeyer, ThreadedOperator>
    s_Registration(CLSID_DeltaKeyer, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Matte/DeltaKeyer"},
                    {RegName, "Delta Keyer"},
                    {RegCategory, "Matte"},
                    {RegAbbreviation, "DK"},
                    {RegHelp, "Creates a matte from a Blue or Green screen"},
                    {RegIcon, "Icons.Tools.Icons.DeltaKeyer"},
                    {RegNoMotionBlurControls, 1},
                    {RegHasOperatorControl, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

enum View { ViewFinal, ViewIntermediate, ViewPreMatte, ViewMatte, ViewTuning, ViewStatus };
constexpr IdChoice kViews[] = {{"Final Result", "Final"},         {"Intermediate Result", "Intermediate"},
                               {"Pre Matte", "PreMatte"},         {"Matte", "Matte"},
                               {"Tuning Ranges", "TuningRanges"}, {"Status", "Status"}};
constexpr IdChoice kReplaceModes[] = {
    {"None", "None"}, {"Source", "Source"}, {"Hard Color", "HardColor"}, {"Soft Color", "SoftColor"}};
constexpr IdChoice kSpillMethods[] = {
    {"None", "None"}, {"Rare", "Rare"}, {"Medium", "Medium"}, {"Well Done", "WellDone"}, {"Burnt", "Burnt"}};
enum SolidSourceAlpha { SolidIgnore, SolidAdd, SolidSubtract };

/// Below this an amount does nothing.
constexpr double kNoChange = 1.1920928955078125e-7;
/// Blur controls are lengths on a frame 720 wide; the blur takes frame fractions.
constexpr double kSizeUnit = 720.0;
/// The image inputs are fetched after the controls, so that CheckRequest can
/// read the blur sizes.
constexpr int kImagePriority = PriorityDefault + 1;
/// The pre-matte's range inputs: the four lows, then the four highs.
constexpr const char *kPreMatteRangeIds[8] = {"PreMatteLowRed",       "PreMatteLowGreen",     "PreMatteLowBlue",
                                              "PreMatteLowLuminance", "PreMatteHighRed",      "PreMatteHighGreen",
                                              "PreMatteHighBlue",     "PreMatteHighLuminance"};

TagList Slider(double def, double low, double high) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Slider},
            {InputDefault, def},
            {InputSliderLow, low},
            {InputSliderHigh, high}};
}
TagList Hard(TagList t, double min, double max) {
    t.Add({InputMinAllowed, min}), t.Add({InputMaxAllowed, max});
    return t;
}
TagList Checkbox(double def) {
    return {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Checkbox}, {InputDefault, def}};
}
template <size_t N> TagList IdButtons(const IdChoice (&list)[N], const char *def) {
    return WithIdChoices({{LinkDataType, CLSID_DataType_OvID},
                          {InputControl, CLSID_InputControl_MultiButtonID},
                          {ButtonsFillRow, 1},
                          {InputDefaultId, OvID(def)}},
                         list);
}
TagList Page(const char *icon) { return {{PageIcon, static_cast<const void *>(icon)}}; }

bool Checked(const Input *in) {
    const auto *n = dynamic_cast<const Number *>(in->Constant().Get());
    return n && n->value >= 0.5;
}

/// Blurs `img` in place (alpha only unless `colour`), size in frame fractions.
bool Blur(const DeltaKeyerRun &run, Image *img, double size, int kind, int passes, bool colour = false) {
    return img->BlurTagList(img, {{BlurFilterType, kind},
                                  {BlurDoRed, colour},
                                  {BlurDoGreen, colour},
                                  {BlurDoBlue, colour},
                                  {BlurDoAlpha, 1},
                                  {BlurXSize, size},
                                  {BlurYSize, size},
                                  {BlurPasses, passes},
                                  {WorkUseGPU, run.device},
                                  {WorkRequest, run.req}});
}

/// After a host step wrote an image's rows, a device copy it kept is stale.
bool RowsWritten(Image *img, bool ok) {
    if (ok) img->SetGPUMem(nullptr, false);
    return ok;
}

} // namespace

struct DeltaKeyer::Settings {
    int view = ViewFinal;
    DeltaKeyerScreenInputs color, alpha;
    bool same = true;
    double preBlur = 0;
    DeltaKeyerPreMatteRanges ranges;
    bool preMatte = false; ///< any range moved from 0..1
    double preErode = 0, preMatteBlur = 0;
    float low = 0, high = 1;
    double restore = 0, erodeDilate = 0, blur = 0, cleanForeground = 0, cleanBackground = 0;
    int replaceMode = DeltaKeyerReplaceSoftColor;
    float replace[3] = {0.5f, 0.5f, 0.5f};
    int spillMethod = 0;
    double spill = 1, fringeGamma = 1, fringeSize = 0, fringeShape = 1, shift[3] = {0, 0, 0};
    int solidSourceAlpha = SolidIgnore, solidReplaceMode = DeltaKeyerReplaceSoftColor;
    float solidReplace[3] = {0.5f, 0.5f, 0.5f};
    Ref<ColorCurvesTable> table;
};

DeltaKeyer::DeltaKeyer(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags),
      picker_(*this, "PreMatteLockPicking", kPreMatteRangeIds, "DeltaKeyer Pick Pre Matte") {
    view_ = AddInputTagList("View Mode", "ViewMode",
                            WithIdChoices({{LinkDataType, CLSID_DataType_OvID},
                                           {InputControl, CLSID_InputControl_ComboID},
                                           {InputDefaultId, OvID("Final")}},
                                          kViews));
    // A colour control of three Number inputs "<label> Red" ... with IDs prefix + channel.
    static const char *const kChannels[3] = {"Red", "Green", "Blue"};
    static const int kColorChannels[3] = {ColorChannelRed, ColorChannelGreen, ColorChannelBlue};
    auto color = [this](Input **out, const char *label, const char *prefix, const char *colorLabel, int group,
                        double def) {
        for (int c = 0; c < 3; ++c) {
            TagList t = Slider(def, 0.0, 1.0);
            t.Set({InputControl, CLSID_InputControl_Color});
            t.Add({ControlGroup, group}), t.Add({ControlMember, c}), t.Add({ColorChannel, kColorChannels[c]});
            if (c == 0) t.Add({ControlLabel, colorLabel});
            const std::string name = std::string(label) + " " + kChannels[c], id = std::string(prefix) + kChannels[c];
            out[c] = AddInputTagList(name.c_str(), id.c_str(), t);
        }
    };

    AddControlPageTagList("Key", Page("Icons.Tools.Tabs.ChromaKeyer"));
    color(background_, "Background", "Background", "Background Color", 1, 0.5);
    preBlur_ = AddInputTagList("Pre-Blur", "PreBlur", Hard(Slider(0.0, 0.0, 10.0), 0.0, 1000.0));
    gain_ = AddInputTagList("Gain", "Gain", Slider(1.0, 0.0, 2.0));
    balance_ = AddInputTagList("Balance", "Balance", Slider(0.5, 0.0, 1.0));
    TagList lock = Checkbox(1.0);
    lock.Add({InputNotify, 1});
    lockReference_ =
        AddInputTagList("Lock Alpha/Spill Removal Color Balance Reference", "LockAlphaSpillReference", lock);
    color(alphaReference_, "Alpha Reference", "AlphaReference", "Alpha Color Balance Reference", 2, 0.5);
    color(spillReference_, "Spill Reference", "SpillReference", "Spill Color Balance Reference", 3, 0.5);

    AddControlPageTagList("Pre Matte", Page("Icons.Tools.Icons.DeltaKeyer.Toolbar"));
    preSoft_ = AddInputTagList("Soft Range", "PreMatteSoftRange", Hard(Slider(0.0, 0.0, 0.2), 0.0, 1.0));
    preErode_ = AddInputTagList("Erode", "PreMatteErode", Hard(Slider(0.0, 0.0, 0.05), 0.0, 1.0));
    preBlurMatte_ = AddInputTagList("Blur", "PreMatteBlur", Hard(Slider(0.0, 0.0, 10.0), 0.0, 1000.0));
    TagList pickLock = Checkbox(0.0);
    pickLock.Add({InputExternal, 0}), pickLock.Add({InputPassive, 1});
    AddInputTagList("Lock Color Picking", "PreMatteLockPicking", pickLock);
    preRanges_.Add(*this, kPreMatteRangeIds, 4);
    resetRanges_ = AddButton(this, "Reset Pre Matte Ranges", "ResetPreMatteRanges");

    AddControlPageTagList("Matte", Page("Icons.Tools.Tabs.Matte"));
    auto threshold = [](double def, int member) {
        TagList t = Hard(Slider(def, 0.0, 1.0), 0.0, 1.0);
        t.Set({InputControl, CLSID_InputControl_Range});
        t.Add({ControlGroup, 8}), t.Add({ControlMember, member});
        if (member == 0) t.Add({ControlRowLabel, "Threshold"});
        return t;
    };
    lowThreshold_ = AddInputTagList("Low", "LowThreshold", threshold(0.0, 0));
    highThreshold_ = AddInputTagList("High", "HighThreshold", threshold(1.0, 1));
    restoreFringe_ = AddInputTagList("Restore Fringe", "RestoreFringe", Hard(Slider(0.0, 0.0, 0.02), 0.0, 1.0));
    erodeDilate_ = AddInputTagList("Erode/Dilate", "ErodeDilate", Hard(Slider(0.0, -0.02, 0.02), -1.0, 1.0));
    blur_ = AddInputTagList("Blur", "Blur", Hard(Slider(0.0, 0.0, 10.0), 0.0, 1000.0));
    cleanForeground_ = AddInputTagList("Clean Foreground", "CleanForeground", Hard(Slider(0.0, 0.0, 1.0), 0.0, 1.0));
    cleanBackground_ = AddInputTagList("Clean Background", "CleanBackground", Hard(Slider(0.0, 0.0, 1.0), 0.0, 1.0));
    replaceMode_ = AddInputTagList("Replace Mode", "ReplaceMode", IdButtons(kReplaceModes, "SoftColor"));
    color(replace_, "Replace", "Replace", "Replace Color", 9, 0.5);

    AddControlPageTagList("Fringe", Page("Icons.Tools.Tabs.Spill"));
    spillMethod_ = AddInputTagList("Spill Method", "SpillMethod", IdButtons(kSpillMethods, "None"));
    spill_ = AddInputTagList("Spill Suppression", "SpillSuppression", Hard(Slider(1.0, 0.0, 1.0), 0.0, 1.0));
    TagList gamma = Slider(1.0, 0.01, 9.0);
    gamma.Add({InputMinAllowed, 0.01}), gamma.Add({SliderRest, 1.0});
    fringeGamma_ = AddInputTagList("Fringe Gamma", "FringeGamma", gamma);
    fringeSize_ = AddInputTagList("Fringe Size", "FringeSize", Hard(Slider(0.0, 0.0, 10.0), 0.0, 50.0));
    TagList shape = Slider(1.0, 0.5, 1.5);
    shape.Add({InputMinAllowed, 0.5}), shape.Add({SliderRest, 1.0});
    fringeShape_ = AddInputTagList("Fringe Shape", "FringeShape", shape);
    static const char *const kShiftLabels[3] = {"Red/Cyan", "Green/Magenta", "Blue/Yellow"};
    static const char *const kShiftIds[3] = {"FringeRedCyan", "FringeGreenMagenta", "FringeBlueYellow"};
    for (int c = 0; c < 3; ++c)
        fringeShift_[c] = AddInputTagList(kShiftLabels[c], kShiftIds[c], Hard(Slider(0.0, -0.5, 0.5), -1.0, 1.0));

    AddControlPageTagList("Tuning", Page("Icons.Tools.Tabs.Ranges"));
    tuningRanges_ =
        AddInputTagList("Tuning Ranges", "TuningRanges",
                        {{LinkDataType, CLSID_DataType_ColorCurves}, {InputControl, CLSID_InputControl_ColorRanges}});
    presetSimple_ = AddButton(this, "Simple", "PresetSimpleRanges");
    presetSmooth_ = AddButton(this, "Smooth", "PresetSmoothRanges");
    lockTuning_ = AddInputTagList("Lock Alpha/Spill Removal Tuning", "LockAlphaSpillTuning", lock);
    static const char *const kRanges[3] = {"Shadows", "Midtones", "Highlights"};
    for (int r = 0; r < 3; ++r)
        alphaGains_[r] = AddInputTagList(("Alpha " + std::string(kRanges[r])).c_str(),
                                         ("Alpha" + std::string(kRanges[r]) + "Gain").c_str(), Slider(1.0, 0.0, 2.0));
    for (int r = 0; r < 3; ++r)
        spillGains_[r] = AddInputTagList(("Spill " + std::string(kRanges[r])).c_str(),
                                         ("Spill" + std::string(kRanges[r]) + "Gain").c_str(), Slider(1.0, 0.0, 2.0));

    AddControlPageTagList("Mask", Page("Icons.Tools.Tabs.Mask"));
    solid_ = std::make_unique<MaskInputs>(*this, "Solid", "Solid Matte");
    solidSourceAlpha_ = AddInputTagList("Solid Source Alpha", "SolidSourceAlpha",
                                        {{LinkDataType, CLSID_DataType_Number},
                                         {InputControl, CLSID_InputControl_MultiButton},
                                         {InputDefault, 0.0},
                                         {ButtonsFillRow, 1},
                                         {ListAddItem, "Ignore"},
                                         {ListAddItem, "Add"},
                                         {ListAddItem, "Subtract"}});
    solidReplaceMode_ =
        AddInputTagList("Solid Replace Mode", "SolidReplaceMode", IdButtons(kReplaceModes, "SoftColor"));
    color(solidReplace_, "Solid Replace", "SolidReplace", "Solid Replace Color", 10, 0.5);
    garbage_ = std::make_unique<MaskInputs>(*this, "Garbage", "Garbage Matte");

    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image},
                              {LinkMain, 1},
                              {InputPriority, kImagePriority},
                              {ImageFromRequestOK, 1}});
    clean_ = AddInputTagList(
        "Clean Plate", "Clean",
        {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 3}, {InputRequired, 0}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

DeltaKeyer::~DeltaKeyer() = default;

void DeltaKeyer::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (param) {
        if (in == resetRanges_) preRanges_.Reset();
        if (in == presetSimple_) tuningRanges_->SetValue(MakeRef<ColorCurvesTable>(ColorCurvesTable::Preset::Simple));
        if (in == presetSmooth_) tuningRanges_->SetValue(MakeRef<ColorCurvesTable>(ColorCurvesTable::Preset::Smooth));
    }
    // A locked spill reference or tuning follows the alpha's: its own controls hide.
    if (in == lockReference_ || in == lockTuning_) {
        const bool reference = Checked(lockReference_), tuning = Checked(lockTuning_);
        for (int c = 0; c < 3; ++c) {
            spillReference_[c]->SetAttrsTagList({{ControlVisible, reference ? 0 : 1}});
            spillGains_[c]->SetAttrsTagList({{ControlVisible, tuning ? 0 : 1}});
        }
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void DeltaKeyer::Reach(const Settings &s, const ImageDomain *domain, int &rx, int &ry) {
    // Each blur's size (frame fractions) and passes, in the chain's order.
    const std::pair<double, int> blurs[] = {{s.preBlur / kSizeUnit, 1},
                                            {s.preMatte ? s.preErode : 0.0, 1},
                                            {s.preMatte ? s.preMatteBlur / kSizeUnit : 0.0, 1},
                                            {s.restore, 1},
                                            {std::fabs(s.erodeDilate), 1},
                                            {s.blur / kSizeUnit, 1},
                                            {s.fringeSize / kSizeUnit, 2}};
    double x = 0, y = 0;
    for (const auto &[size, passes] : blurs) {
        double bx = size, by = size;
        if (size > kNoChange && Image::GetBlurSupport(BlurGaussian, domain, bx, by, passes)) x += bx, y += by;
    }
    rx = static_cast<int>(std::ceil(x)), ry = static_cast<int>(std::ceil(y));
}

void DeltaKeyer::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != kImagePriority || (req->GetFlags() & ReqFlagSkipRoI)) return;
    const AutoImageRoI roi(req);
    const AutoImageDoD inDoD(req, input_);
    Settings s;
    int rx = 0, ry = 0;
    if (!roi || !inDoD || !ReadSettings(req, s)) return;
    Reach(s, inDoD.Get(), rx, ry);
    if (rx == 0 && ry == 0) return;
    const ImageDomain region = roi->WithRect(roi->rect.Grown(rx, ry));
    req->SetInputRoI(input_, &region);
    req->SetInputRoI(clean_, &region);
}

bool DeltaKeyer::ControlCommand(int command, const TagList &tags) {
    return command == CCMD_Select && picker_.Select(tags);
}

bool DeltaKeyer::ReadSettings(Request *req, Settings &s) const {
    auto num = [req](const Input *in, double def) { return req->GetInputNumber(in, def); };
    auto flt = [&](const Input *in, double def) { return static_cast<float>(num(in, def)); };
    s.view = IdIndex(req->GetInputID(view_, OvID("Final")), kViews);
    float bg[3], alphaRef[3], spillRef[3];
    double alphaGains[3], spillGains[3];
    for (int c = 0; c < 3; ++c) {
        bg[c] = flt(background_[c], 0.5);
        alphaRef[c] = flt(alphaReference_[c], 0.5), spillRef[c] = flt(spillReference_[c], 0.5);
        alphaGains[c] = num(alphaGains_[c], 1.0), spillGains[c] = num(spillGains_[c], 1.0);
        s.replace[c] = flt(replace_[c], 0.5), s.solidReplace[c] = flt(solidReplace_[c], 0.5);
        s.shift[c] = num(fringeShift_[c], 0.0);
    }
    const bool lockReference = num(lockReference_, 1.0) >= 0.5, lockTuning = num(lockTuning_, 1.0) >= 0.5;
    s.table = Ref<ColorCurvesTable>(dynamic_cast<ColorCurvesTable *>(req->GetInputData(tuningRanges_)));
    if (!s.table) s.table = MakeRef<ColorCurvesTable>();
    for (DeltaKeyerScreenInputs *in : {&s.alpha, &s.color}) {
        const bool alpha = in == &s.alpha;
        std::copy(bg, bg + 3, in->background);
        std::copy(alpha || lockReference ? alphaRef : spillRef, (alpha || lockReference ? alphaRef : spillRef) + 3,
                  in->reference);
        std::copy(alpha || lockTuning ? alphaGains : spillGains, (alpha || lockTuning ? alphaGains : spillGains) + 3,
                  in->rangeGains);
        in->gain = num(gain_, 1.0), in->balance = num(balance_, 0.5);
        in->table = s.table.Get();
    }
    s.same = std::equal(s.alpha.reference, s.alpha.reference + 3, s.color.reference) &&
             std::equal(s.alpha.rangeGains, s.alpha.rangeGains + 3, s.color.rangeGains);
    s.preBlur = num(preBlur_, 0.0);
    s.preMatte = !preRanges_.Read(req, s.ranges.low, s.ranges.high);
    s.ranges.soft = flt(preSoft_, 0.0);
    s.preErode = num(preErode_, 0.0), s.preMatteBlur = num(preBlurMatte_, 0.0);
    s.low = flt(lowThreshold_, 0.0), s.high = flt(highThreshold_, 1.0);
    s.restore = num(restoreFringe_, 0.0), s.erodeDilate = num(erodeDilate_, 0.0), s.blur = num(blur_, 0.0);
    s.cleanForeground = num(cleanForeground_, 0.0), s.cleanBackground = num(cleanBackground_, 0.0);
    s.replaceMode = IdIndex(req->GetInputID(replaceMode_, OvID("SoftColor")), kReplaceModes);
    s.spillMethod = IdIndex(req->GetInputID(spillMethod_, OvID("None")), kSpillMethods);
    s.spill = num(spill_, 1.0);
    s.fringeGamma = num(fringeGamma_, 1.0), s.fringeSize = num(fringeSize_, 0.0),
    s.fringeShape = num(fringeShape_, 1.0);
    s.solidSourceAlpha = std::clamp(static_cast<int>(std::lround(num(solidSourceAlpha_, 0.0))), 0, 2);
    s.solidReplaceMode = IdIndex(req->GetInputID(solidReplaceMode_, OvID("SoftColor")), kReplaceModes);
    return true;
}

Ref<Image> DeltaKeyer::Key(Request *req, const Settings &s, const Image *src, const Image *clean, const Image *solid,
                           bool solidInverted, const Image *garbage, bool garbageInverted) {
    const DeltaKeyerRun run{req, IsGPUEnabled(req, true) && !req->IsPreCalc()};
    const OvID clipping = GetClippingMode(req);
    const ImgRectI outWindow = OutputDataWindow(req, input_, src, clipping);
    // Under a region of interest the work reaches beyond it by the blurs' reach,
    // so that pixels at its edge see their neighbours; the result is cut back.
    int rx = 0, ry = 0;
    const AutoImageRoI roi(req);
    if (roi) {
        const ImageDomain frame = DomainOfImage(*src, src->DataWindow());
        Reach(s, &frame, rx, ry);
    }
    const ImgRectI dw = outWindow.Grown(rx, ry);
    // Working images: colour in RGBA float, mattes in one float channel.
    auto make = [&](int depth = DepthRGBAFlt32) {
        Ref<Image> img =
            NewImageTagList({{ImgLikeImage, src}, {ImgDepth, depth}, {ImgDataWindow, &dw}, {ImgForRequest, 1}});
        if (img) img->SetAbortFlag(src->AbortFlag());
        return img;
    };
    auto copy = [](const Ref<Image> &img) { return CopyOfImage(img.Get()); };
    auto alphaOf = [&](const Ref<Image> &img) {
        Ref<Image> matte = make(DepthAFlt32);
        if (matte && !MatteCore_DoCopyChannel(req, img.Get(), matte.Get(), MatteAlpha, MatteAlpha)) matte = nullptr;
        return matte;
    };
    auto aborted = [&] { return src->CheckAbort() || (req->GetTask() && req->GetTask()->IsAborted()); };
    const bool status = s.view == ViewStatus;
    Ref<Image> out = make();
    if (!out) return {};

    // 1. Records; the tuning view shows the curve table's weights of the source.
    DeltaKeyerScreenInfo color, alpha;
    BuildDeltaKeyerScreenInfo(s.color, color);
    BuildDeltaKeyerScreenInfo(s.alpha, alpha);
    if (s.view == ViewTuning) return ProcessRangesToColor(run, src, out.Get(), *s.table) ? out : nullptr;
    // 2. A background that cannot key gives the source itself.
    if (DeltaKeyerDenominator(color.p) == 0.f && DeltaKeyerDenominator(alpha.p) == 0.f && !clean) {
        out->ImageCopy(src);
        out->CopyCanvasColor(src);
        return out;
    }

    // 3-4. The pre-matte and the image the screen pass sees.
    Ref<Image> screenIn;
    if (s.preMatte) {
        Ref<Image> pre = make(DepthAFlt32);
        if (!pre || !ProcessPreMatte(run, src, pre.Get(), s.ranges)) return {};
        if (s.preErode > kNoChange &&
            !(Blur(run, pre.Get(), s.preErode, BlurGaussian, 1) && ProcessThreshold(run, pre.Get(), 0.8f, 1.f)))
            return {};
        if (s.preMatteBlur > kNoChange && !Blur(run, pre.Get(), s.preMatteBlur / kSizeUnit, BlurGaussian, 1)) return {};
        if (s.view == ViewPreMatte)
            return ProcessSourceAlpha(run, pre.Get(), out.Get(), DeltaKeyerSourceAlphaShow) ? out : nullptr;
        const float other[4] = {s.color.background[0], s.color.background[1], s.color.background[2], 1.f};
        screenIn = make();
        if (!screenIn || !ProcessPreMatteCombine(run, src, screenIn.Get(), pre.Get(), clean, other)) return {};
    } else if (s.view == ViewPreMatte) { // no ranges: nothing is taken for screen
        out->Fill({1.f, 1.f, 1.f, 1.f});
        out->SetCanvasColor(FltPixel{1.f, 1.f, 1.f, 1.f});
        return out;
    }
    // 5. Pre-blur.
    if (s.preBlur > kNoChange) {
        if (!screenIn) {
            screenIn = make();
            if (!screenIn) return {};
            screenIn->ImageCopy(src);
            screenIn->CopyCanvasColor(src);
        }
        if (!Blur(run, screenIn.Get(), s.preBlur / kSizeUnit, BlurGaussian, 1, true)) return {};
    }
    // 6. The screen pass.
    if (!ProcessScreen(run, screenIn ? screenIn.Get() : src, out.Get(), clean, color, alpha, s.same) || aborted())
        return {};

    // 7. The matte stage; `before` keeps the screen's alpha.
    const bool stage = s.cleanForeground > kNoChange || s.cleanBackground > kNoChange || s.low > 0.f || s.high < 1.f ||
                       s.restore > kNoChange || std::fabs(s.erodeDilate) > kNoChange || s.blur > kNoChange;
    Ref<Image> before = stage || status ? alphaOf(out) : out;
    if (!before) return {};
    if (stage) {
        if (s.cleanForeground > kNoChange &&
            !RowsWritten(out.Get(), MatteCore_DoInFill(req, out.Get(), s.cleanForeground)))
            return {};
        if (s.cleanBackground > kNoChange &&
            !RowsWritten(out.Get(), MatteCore_DoInFill(req, out.Get(), -s.cleanBackground)))
            return {};
        Ref<Image> soft = s.restore > kNoChange ? alphaOf(out) : nullptr;
        if ((s.low > 0.f || s.high < 1.f) && !ProcessThreshold(run, out.Get(), s.low, s.high)) return {};
        if (s.restore > kNoChange) {
            // The threshold matte blurred, then shrunk and grown: the band between
            // them takes the soft alpha back.
            Ref<Image> eroded = alphaOf(out);
            if (!soft || !eroded || !Blur(run, eroded.Get(), s.restore, BlurGaussian, 1)) return {};
            Ref<Image> dilated = copy(eroded);
            if (!dilated || !ProcessThreshold(run, eroded.Get(), 0.5f, 1.f) ||
                !ProcessThreshold(run, dilated.Get(), 0.f, 0.5f) ||
                !ProcessRestoreFringe(run, soft.Get(), out.Get(), eroded.Get(), dilated.Get()))
                return {};
        }
        if (std::fabs(s.erodeDilate) > kNoChange) {
            const bool erode = s.erodeDilate < 0;
            if (!Blur(run, out.Get(), std::fabs(s.erodeDilate), BlurGaussian, 1) ||
                !ProcessThreshold(run, out.Get(), erode ? 0.5f : 0.f, erode ? 1.f : 0.5f))
                return {};
        }
        if (s.blur > kNoChange && !Blur(run, out.Get(), s.blur / kSizeUnit, BlurGaussian, 1)) return {};
        // 8. Colour rebuilt for the alpha the stage moved.
        if (!status && !ProcessReplace(run, s.replaceMode, src, before.Get(), out.Get(), out.Get(), s.replace))
            return {};
    }
    if (aborted()) return {};
    // 9. The status colours, or colour and alpha brought in step.
    if (status) {
        Ref<Image> diff = make(DepthAFlt32);
        if (!diff || !ProcessStatusDiff(run, before.Get(), out.Get(), diff.Get()) ||
            !ProcessStatus(run, out.Get(), diff.Get(), false))
            return {};
    } else if (stage && !ProcessColorMax(run, nullptr, out.Get())) {
        // (Without the stage the screen's alpha already holds max(R, G, B).)
        return {};
    }
    Ref<Image> intermediate = s.view == ViewIntermediate ? copy(out) : nullptr;

    // 10. The solid matte and the source's own alpha.
    if (solid || s.solidSourceAlpha != SolidIgnore) {
        Ref<Image> preSolid = alphaOf(out);
        if (!preSolid) return {};
        if (solid && status && !ProcessStatusSolid(run, out.Get(), solid, solidInverted)) return {};
        if (solid && !ProcessMaskMerge(run, solid, out.Get(), false, solidInverted)) return {};
        if (s.solidSourceAlpha == SolidAdd && !ProcessMaskMerge(run, src, out.Get(), false)) return {};
        if (s.solidSourceAlpha == SolidSubtract &&
            !ProcessSourceAlpha(run, src, out.Get(), DeltaKeyerSourceAlphaSubtract))
            return {};
        const Image *gate = solid ? solid : src;
        if (!status && !ProcessReplaceMask(run, s.solidReplaceMode, src, preSolid.Get(), gate, solid && solidInverted,
                                           out.Get(), s.solidReplace))
            return {};
    }

    // 11. Spill on the key channel, then the fringe colour.
    if (!status && s.spillMethod > 0 && s.spill > kNoChange) {
        static const int kSpillChannel[3] = {2, 1, 0}; // red, green, blue keys; the step counts blue as 0
        const ChromaValues chroma{kSpillChannel[color.p.keyIndex], s.spill, s.spillMethod - 1};
        if (!RowsWritten(out.Get(), MatteCore_DoSpill(req, out.Get(), chroma))) return {};
    }
    const bool fringe = std::fabs(s.fringeShape - 1) > kNoChange || std::fabs(s.shift[0]) > kNoChange ||
                        std::fabs(s.shift[1]) > kNoChange || std::fabs(s.shift[2]) > kNoChange;
    if (!status && fringe) {
        Ref<Image> edge = make(DepthAFlt32);
        if (!edge || !MatteCore_DoCopyChannel(req, out.Get(), edge.Get(), MatteAlpha, MatteAlpha)) return {};
        if (s.fringeSize > kNoChange && !Blur(run, edge.Get(), s.fringeSize / kSizeUnit, BlurGaussian, 2)) return {};
        if (std::fabs(s.fringeGamma - 1) > kNoChange &&
            !DoLevelsFlt(req, edge.Get(), {{MatteLevelsGamma, std::max(s.fringeGamma, 1e-5)}}))
            return {};
        if (!RowsWritten(out.Get(), MatteCore_DoFringeFlt(req, out.Get(), edge.Get(), std::max(s.fringeShape, 1e-5),
                                                          0.5 * s.shift[0], 0.5 * s.shift[1], 0.5 * s.shift[2])))
            return {};
    }

    // 12. The garbage matte.
    if (garbage) {
        if (status && !ProcessStatusGarbage(run, out.Get(), garbage, garbageInverted)) return {};
        out = DoGarbageMatte(req, out.Get(), garbage, GarbageMatteGarbage, !status, garbageInverted);
        if (!out) return {};
        RowsWritten(out.Get(), true);
    }
    if (intermediate && !ProcessCopyColor(run, intermediate.Get(), out.Get())) return {};
    if (s.view == ViewMatte && !ProcessAlphaToColor(run, out.Get(), out.Get(), false)) return {};
    if (clipping != ClippingMode_None) out->CopyCanvasColor(src);
    if (aborted()) return nullptr;
    return rx == 0 && ry == 0 ? out : out->CopyOfImageTagList({{ImgDataWindow, &outWindow}});
}

void DeltaKeyer::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    Settings s;
    if (!src || !ReadSettings(req, s)) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    if (req->IsPreCalc()) { // the output's windows, without pixels
        const ImgRectI dw = OutputDataWindow(req, input_, src, GetClippingMode(req));
        req->SetOutputData(output_, NewImageTagList({{ImgLikeImage, src},
                                                     {ImgDepth, DepthRGBAFlt32},
                                                     {ImgDataWindow, &dw},
                                                     {ImgNoData, 1},
                                                     {ImgForRequest, 1}}));
        return;
    }
    picker_.Apply(*src, 1, s.ranges.low, s.ranges.high); // the R, G, B and luminance axes
    bool solidInverted = false, garbageInverted = false;
    Image *solid = solid_->GetMask(req, &solidInverted), *garbage = garbage_->GetMask(req, &garbageInverted);
    auto *clean = dynamic_cast<Image *>(req->GetInputData(clean_));
    Ref<Image> out = Key(req, s, src, clean, solid, solidInverted, garbage, garbageInverted);
    if (!out) {
        if (!src->CheckAbort() && !(req->GetTask() && req->GetTask()->IsAborted())) FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    req->SetOutputData(output_, out);
}

} // namespace Orvane
