#include "operators/media/Loader.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <thread>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/GamutInputs.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Half.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelMemory.h"
#include "host/image/ResizeFilters.h"
#include "host/media/ImageFormatList.h"
#include "operators/frame/IdChoices.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Loader("Loader");
static ClassRegistration<Loader, ThreadedOperator>
    s_LoaderRegistration(CLSID_Loader, &CLSID_ThreadedOperator,
                         {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindSource},
                          {RegPath, "Tools/IO/Loader"},
                          {RegName, "Loader"},
                          {RegCategory, "I/O"},
                          {RegAbbreviation, "LD"},
                          {RegHelp, "Loads frames from a clip sequence or device"},
                          {RegIcon, "Icons.Tools.Icons.Loader"},
                          {RegAlias, "Read"},
                          {RegAlias, "Import"},
                          {RegAlias, "Media"},
                          {RegNoMotionBlurControls, 1},
                          {RegSupportsRoI, 1},
                          {RegSupportsDoD, 1},
                          {RegClipSourceTool, 1}});

namespace loader_detail {

// Process modes in list order, and the field order each stands for.
constexpr IdChoice kProcessModes[] = {{"Full Frames", "FullFrames"},
                                      {"NTSC Fields", "NTSC"},
                                      {"PAL/HD Fields", "PAL"},
                                      {"PAL/HD Fields (Reversed)", "PALReversed"},
                                      {"NTSC Fields (Reversed)", "NTSCReversed"}};
constexpr int kProcessModeNumbers[] = {0, 2, 1, 4, 3};
constexpr IdChoice kPullTypes[] = {{"Standard 2:3", "Standard"}, {"Advanced 2:3", "Advanced"}};
constexpr IdChoice kCacheModes[] = {{"Default", "Default"}, {"On", "On"}, {"Off", "Off"}};

TagList NumberTags(TagList extra) {
    TagList t{{LinkDataType, CLSID_DataType_Number}};
    t.Merge(extra);
    return t;
}

/// The first run of digits in a name ("Clip12" gives 12), or 0.
int NumberIn(const std::string &s) {
    const auto at = s.find_first_of("0123456789");
    return at == std::string::npos ? 0 : std::atoi(s.c_str() + at);
}

/// A number of a "Clips" entry.
double Field(const ScriptVal &entry, const char *key, double def) {
    const ScriptVal *v = entry.Find(key);
    if (v && v->IsNumber()) return v->AsNumber();
    if (v && v->IsBool()) return v->AsBool() ? 1.0 : 0.0;
    return def;
}

/// An image of `depth` holding `src`'s pixels, windows and attributes.
Ref<Image> ConvertDepth(const Image *src, int depth) {
    if (!src || src->Depth() == depth) return Ref<Image>(const_cast<Image *>(src));
    ImgRectI dw = src->DataWindow();
    Ref<Image> out = NewImageTagList({{ImgLikeImage, src}, {ImgDepth, depth}, {ImgDataWindow, &dw}});
    if (!out) return out;
    out->SetScale(src->XScale(), src->YScale());
    out->CopyCanvasColor(src);
    out->Metadata() = src->Metadata();
    if (src->IsNoData()) {
        out->SetNoData(true);
        return out;
    }
    if (!out->AllocScanLineData()) return Ref<Image>();
    out->ImageCopy(src);
    return out;
}

/// The alpha options of one request.
struct AlphaSteps {
    bool solid, invert, post;
};

// Pixel models of the alpha step. Integer colour is multiplied by alpha with
// rounding: (x a + h + ((x a + h) >> n)) >> n divides by 2^n - 1 exactly.
struct Int16Alpha {
    using T = uint16_t;
    using V = uint32_t;
    static constexpr V One = 65535;
    static V Load(T v) { return v; }
    static T Store(V v) { return static_cast<T>(v); }
    static T Multiply(T x, V a) {
        const V v = x * a + 32768;
        return static_cast<T>((v + (v >> 16)) >> 16);
    }
};
struct Int8Alpha {
    using T = uint8_t;
    using V = uint32_t;
    static constexpr V One = 255;
    static V Load(T v) { return v; }
    static T Store(V v) { return static_cast<T>(v); }
    static T Multiply(T x, V a) {
        const V v = x * a + 128;
        return static_cast<T>((v + (v >> 8)) >> 8);
    }
};
struct FloatAlpha {
    using T = float;
    using V = float;
    static constexpr V One = 1.0f;
    static V Load(T v) { return v; }
    static T Store(V v) { return v; }
    static T Multiply(T x, V a) { return x * a; }
};
struct HalfAlpha {
    using T = uint16_t;
    using V = float;
    static constexpr V One = 1.0f;
    static V Load(T v) { return HalfToFloat(v); }
    static T Store(V v) { return FloatToHalf(v); }
    static T Multiply(T x, V a) { return FloatToHalf(HalfToFloat(x) * a); }
};

template <class Px> void AlphaRow(typename Px::T *p, int n, const AlphaSteps &s) {
    for (int x = 0; x < n; ++x, p += 4) {
        typename Px::V a = Px::Load(p[3]);
        if (s.solid)
            a = s.invert ? 0 : Px::One;
        else if (s.invert)
            a = Px::One - a;
        p[3] = Px::Store(a);
        if (s.post)
            for (int c = 0; c < 3; ++c) p[c] = Px::Multiply(p[c], a);
    }
}

} // namespace loader_detail

using namespace loader_detail;

/// Everything one request reads from the inputs, read once.
struct Loader::Settings {
    int missing = MissingFail;
    float color[4] = {0, 0, 0, 0};
    int processMode = 0;
    int depth = 0;
    int aspectMode = 0;
    double customAspectX = 1, customAspectY = 1;
    int importMode = 0, pullType = 0, pullFirst = 0;
    bool solid = false, invert = false, postMultiply = false, swapFields = false;
    int proxyScale = 1;
    int field = -1;
};

Loader::Loader(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
    OrvaneDoc *doc = GetDoc();
    const FrameFormat ff = doc ? doc->GetFrameFormat() : FrameFormat{};

    AddControlPageTagList("File", {{PageIcon, static_cast<const void *>("Icons.Tools.Icons.Loader.Toolbar")}});
    inClip_ = AddInputTagList("Filename", "Clip",
                              {{LinkDataType, CLSID_DataType_Clip},
                               {InputControl, CLSID_InputControl_Clip},
                               {InputExternal, 0},
                               {InputNotify, 1}});
    inProxyClip_ = AddInputTagList("Proxy Filename", "ProxyFilename",
                                   {{LinkDataType, CLSID_DataType_Clip},
                                    {InputControl, CLSID_InputControl_Clip},
                                    {InputExternal, 0},
                                    {ControlVisible, 0}});
    inGlobalIn_ = AddInputTagList("Global In", "GlobalIn",
                                  NumberTags({{InputControl, CLSID_InputControl_Range},
                                              {InputNotify, 1},
                                              {InputInitialNotify, 0},
                                              {InputInteger, 1},
                                              {InputExternal, 0},
                                              {ControlShowsTime, 1}}));
    inGlobalOut_ = AddInputTagList(
        "Global Out", "GlobalOut",
        NumberTags(
            {{InputControl, CLSID_InputControl_Range}, {InputInteger, 1}, {InputExternal, 0}, {ControlShowsTime, 1}}));
    inTrimIn_ = AddInputTagList("Trim In", "ClipTimeStart",
                                NumberTags({{InputControl, CLSID_InputControl_Range},
                                            {InputMinAllowed, 0.0},
                                            {InputInteger, 1},
                                            {InputNotify, 1},
                                            {InputInitialNotify, 0}}));
    inTrimOut_ = AddInputTagList("Trim Out", "ClipTimeEnd",
                                 NumberTags({{InputControl, CLSID_InputControl_Range},
                                             {InputMinAllowed, 0.0},
                                             {InputInteger, 1},
                                             {InputNotify, 1},
                                             {InputInitialNotify, 0}}));
    const TagList hold = NumberTags({{InputControl, CLSID_InputControl_Screw},
                                     {InputMinAllowed, 0.0},
                                     {InputSliderHigh, 100.0},
                                     {InputInteger, 1},
                                     {InputNotify, 1},
                                     {InputInitialNotify, 0}});
    inHoldFirst_ = AddInputTagList("Hold First Frame", "HoldFirstFrame", hold);
    inHoldLast_ = AddInputTagList("Hold Last Frame", "HoldLastFrame", hold);
    inReverse_ = AddInputTagList("Reverse", "Reverse", NumberTags({{InputControl, CLSID_InputControl_Checkbox}}));
    inLoop_ = AddInputTagList("Loop", "Loop", NumberTags({{InputControl, CLSID_InputControl_Checkbox}}));
    inMissing_ = AddInputTagList("Missing Frames", "MissingFrames",
                                 NumberTags({{InputControl, CLSID_InputControl_Combo},
                                             {InputInteger, 1},
                                             {InputMinAllowed, 0.0},
                                             {InputMaxAllowed, 3.0},
                                             {InputNotify, 1},
                                             {ListAddItem, "Fail"},
                                             {ListAddItem, "Hold Previous"},
                                             {ListAddItem, "Output Color"},
                                             {ListAddItem, "Wait"}}));
    static const char *const kColorIds[4] = {"Red", "Green", "Blue", "Alpha"};
    for (int c = 0; c < 4; ++c)
        inColor_[c] = AddInputTagList(c == 0 ? "Missing Frame Color" : kColorIds[c], kColorIds[c],
                                      NumberTags({{InputControl, CLSID_InputControl_Color},
                                                  {InputSliderLow, 0.0},
                                                  {InputSliderHigh, 1.0},
                                                  {ControlVisible, 0}}));

    AddControlPageTagList("Import", {});
    const int mode = !ff.fields ? 0 : (ff.height < 520 ? 1 : 2);
    inProcessMode_ = AddInputTagList("Process Mode", "ProcessMode",
                                     WithIdChoices({{LinkDataType, CLSID_DataType_OvID},
                                                    {InputControl, CLSID_InputControl_ComboID},
                                                    {InputDefaultId, OvID(kProcessModes[mode].id)}},
                                                   kProcessModes));
    inDepth_ = AddInputTagList("Depth", "Depth",
                               NumberTags({{InputControl, CLSID_InputControl_MultiButton},
                                           {InputInteger, 1},
                                           {InputMinAllowed, 0.0},
                                           {InputMaxAllowed, 5.0},
                                           {ListAddItem, "Format"},
                                           {ListAddItem, "Default"},
                                           {ListAddItem, "int8"},
                                           {ListAddItem, "int16"},
                                           {ListAddItem, "float16"},
                                           {ListAddItem, "float32"}}));
    inPixelAspect_ = AddInputTagList("Pixel Aspect", "PixelAspect",
                                     NumberTags({{InputControl, CLSID_InputControl_MultiButton},
                                                 {InputInteger, 1},
                                                 {InputMinAllowed, 0.0},
                                                 {InputMaxAllowed, 2.0},
                                                 {InputNotify, 1},
                                                 {ListAddItem, "From File"},
                                                 {ListAddItem, "Default"},
                                                 {ListAddItem, "Custom"}}));
    inCustomAspect_ = AddInputTagList("Custom Pixel Aspect", "CustomPixelAspect",
                                      {{LinkDataType, CLSID_DataType_Point},
                                       {InputControl, CLSID_InputControl_Offset},
                                       {InputDefaultX, ff.aspectX},
                                       {InputDefaultY, ff.aspectY},
                                       {ControlDecimals, 6},
                                       {ControlVisible, 0}});
    inImportMode_ = AddInputTagList("Import Mode", "ImportMode",
                                    NumberTags({{InputControl, CLSID_InputControl_MultiButton},
                                                {InputInteger, 1},
                                                {InputMinAllowed, 0.0},
                                                {InputMaxAllowed, 2.0},
                                                {InputNotify, 1},
                                                {ListAddItem, "Normal"},
                                                {ListAddItem, "2:3 Pullup"},
                                                {ListAddItem, "2:3 Pulldown"}}));
    inPullType_ = AddInputTagList("2:3 Type", "PullType",
                                  WithIdChoices({{LinkDataType, CLSID_DataType_OvID},
                                                 {InputControl, CLSID_InputControl_ComboID},
                                                 {InputNotify, 1},
                                                 {ControlVisible, 0}},
                                                kPullTypes));
    inFirstFrame_ = AddInputTagList("First Frame", "FirstFrame",
                                    NumberTags({{InputControl, CLSID_InputControl_MultiButton},
                                                {InputInteger, 1},
                                                {InputMinAllowed, 0.0},
                                                {InputMaxAllowed, 4.0},
                                                {ControlVisible, 0},
                                                {ListAddItem, "AA"},
                                                {ListAddItem, "BB"},
                                                {ListAddItem, "BC"},
                                                {ListAddItem, "CD"},
                                                {ListAddItem, "DD"}}));
    inLocalCache_ = AddInputTagList(
        "Local Cache (right-click for menu)", "LocalCache",
        WithIdChoices({{LinkDataType, CLSID_DataType_OvID}, {InputControl, CLSID_InputControl_MultiButtonID}},
                      kCacheModes));
    const TagList check = NumberTags({{InputControl, CLSID_InputControl_Checkbox}});
    inSolidAlpha_ = AddInputTagList("Make Alpha solid", "MakeAlphaSolid", check);
    inInvertAlpha_ = AddInputTagList("Invert Alpha", "InvertAlpha", check);
    inPostMultiply_ = AddInputTagList("Post-Multiply by Alpha", "PostMultiplyByAlpha", check);
    inSwapFields_ = AddInputTagList("Swap Field Dominance", "SwapFieldDominance", check);
    gamut_ = std::make_unique<GamutInputs>(this, GamutInputs::ToLinear);

    AddControlPageTagList("Format", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Controls")}});
    outImage_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

Loader::~Loader() = default;

std::string Loader::GetTitle() const {
    std::shared_lock lock(listLock_);
    if (clips_.size() > 1) return Name() + ": Multiple Clips";
    if (clips_.size() == 1) return Name() + ": " + clips_[0].name;
    auto *c = dynamic_cast<const Clip *>(inClip_->Constant().Get());
    return c && !c->FileName().empty() ? Name() + ": " + c->FileName() : Name();
}

double Loader::GetClipLength() const {
    std::shared_lock lock(listLock_);
    if (clips_.empty()) return 1.0;
    const ClipPlacement &p = clips_.front().place;
    return static_cast<double>(ElementLength(p));
}

std::vector<Loader::ClipEntry> Loader::ClipList() const {
    std::shared_lock lock(listLock_);
    return clips_;
}

// ---- editing ----

void Loader::FillFromFile(const std::string &fileName) {
    OrvaneDoc *doc = GetDoc();
    Clip probe(doc ? doc->MapPath(fileName) : fileName);
    std::string error;
    if (!probe.Scan(error)) return; // the file may come later; values stay
    const double length = static_cast<double>(probe.Length());
    const double start = inGlobalIn_->Constant() ? static_cast<const Number &>(*inGlobalIn_->Constant()).value : 0.0;
    filling_ = true;
    // Values a document gave explicitly stay; only defaults are filled.
    if (inTrimOut_->IsDefault()) inTrimOut_->SetValue(MakeRef<Number>(length - 1));
    if (inGlobalOut_->IsDefault()) {
        const double holds = static_cast<const Number &>(*inHoldFirst_->Constant()).value +
                             static_cast<const Number &>(*inHoldLast_->Constant()).value;
        inGlobalOut_->SetValue(MakeRef<Number>(start + length - 1 + holds));
    }
    filling_ = false;
}

void Loader::AddFormatInputs(const std::string &fileName) {
    std::vector<const Registry *> rows = FormatsForExtension(fileName);
    if (rows.empty()) return;
    Ref<ImageFormat> format = NewImageFormat(rows.front());
    if (!format) return;
    const std::string group = std::string("Clip1.") + rows.front()->ID().Text();
    if (!formatGroups_.insert(group).second) return;
    SetCurrentGroup(group);
    format->AddLoadInputs(this);
    SetCurrentGroup({});
}

void Loader::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (param && !filling_) {
        if (in == inClip_) {
            if (auto *clip = dynamic_cast<Clip *>(param); clip && !clip->FileName().empty()) {
                inProxyClip_->SetAttrsTagList({{ControlVisible, 1}});
                AddFormatInputs(clip->FileName());
                FillFromFile(clip->FileName());
            }
        } else if (in == inGlobalIn_ || in == inTrimIn_ || in == inTrimOut_ || in == inHoldFirst_ ||
                   in == inHoldLast_) {
            // The element keeps its length: the out point follows the start, trims and holds.
            auto value = [](Input *i) { return static_cast<const Number &>(*i->Constant()).value; };
            filling_ = true;
            inGlobalOut_->SetValue(MakeRef<Number>(value(inGlobalIn_) + value(inTrimOut_) - value(inTrimIn_) +
                                                   value(inHoldFirst_) + value(inHoldLast_)));
            filling_ = false;
        } else if (in == inMissing_) {
            const bool color = static_cast<int>(static_cast<Number *>(param)->value) == MissingOutputColor;
            for (Input *c : inColor_) c->SetAttrsTagList({{ControlVisible, color}});
        } else if (in == inPixelAspect_) {
            inCustomAspect_->SetAttrsTagList({{ControlVisible, static_cast<Number *>(param)->value == 2}});
        } else if (in == inImportMode_) {
            const bool pulled = static_cast<Number *>(param)->value != 0;
            inPullType_->SetAttrsTagList({{ControlVisible, pulled}});
            inFirstFrame_->SetAttrsTagList({{ControlVisible, pulled}});
        } else if (in == inPullType_) {
            // The fourth cadence position reads "CC" in the advanced cadence.
            const bool advanced = static_cast<IDValue *>(param)->value == OvID("Advanced");
            inFirstFrame_->SetAttrsTagList({{ControlRowLabel, advanced ? "CC" : "CD"}});
        }
        gamut_->NotifyChanged(in, param, time);
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

// ---- requests ----

Loader::Settings Loader::ReadSettings(Request *req) const {
    Settings s;
    s.missing = static_cast<int>(req->GetInputNumber(inMissing_));
    for (int c = 0; c < 4; ++c) s.color[c] = static_cast<float>(req->GetInputNumber(inColor_[c]));
    s.processMode = kProcessModeNumbers[IdIndex(req->GetInputID(inProcessMode_), kProcessModes)];
    s.depth = static_cast<int>(req->GetInputNumber(inDepth_));
    s.aspectMode = static_cast<int>(req->GetInputNumber(inPixelAspect_));
    if (auto *p = dynamic_cast<Point *>(req->GetInputData(inCustomAspect_))) {
        s.customAspectX = p->x;
        s.customAspectY = p->y;
    }
    s.importMode = static_cast<int>(req->GetInputNumber(inImportMode_));
    s.pullType = IdIndex(req->GetInputID(inPullType_), kPullTypes);
    s.pullFirst = static_cast<int>(req->GetInputNumber(inFirstFrame_));
    s.solid = req->GetInputNumber(inSolidAlpha_) >= 0.5;
    s.invert = req->GetInputNumber(inInvertAlpha_) >= 0.5;
    s.postMultiply = req->GetInputNumber(inPostMultiply_) >= 0.5;
    s.swapFields = req->GetInputNumber(inSwapFields_) >= 0.5;
    s.proxyScale = req->ProxyScale();
    s.field = FieldForTime(s.processMode, req->Time(), 0.5);
    return s;
}

void Loader::UpdateClipList(Request *req, const Settings &s) {
    OrvaneDoc *doc = GetDoc();
    auto mapped = [doc](const std::string &name) { return doc ? doc->MapPath(name) : name; };
    const std::vector<ClipEntry> previous = ClipList();
    auto makeClip = [&](const std::string &name, const std::string &altName) {
        ClipEntry e;
        e.name = name;
        const std::string path = mapped(name), altPath = altName.empty() ? std::string() : mapped(altName);
        // A clip seen before keeps its folder scan and its read format.
        for (const ClipEntry &old : previous)
            if (old.name == name && old.clip->FileName() == path) {
                e.clip = old.clip;
                if (old.alt && old.alt->FileName() == altPath) e.alt = old.alt;
            }
        if (!e.clip) {
            e.clip = MakeRef<Clip>(path);
            std::string ignored;
            e.clip->Scan(ignored); // a clip without files still answers, with its missing-frame rule
        }
        if (!altPath.empty() && !e.alt) e.alt = MakeRef<Clip>(altPath);
        return e;
    };

    std::vector<ClipEntry> list;
    const ScriptVal *table = KeptFields().Find("Clips");
    if (table && table->IsTable()) {
        // A document's clip list: one table per clip, in time order.
        for (size_t i = 1; i <= table->ArrayLength(); ++i) {
            const ScriptVal &e = *table->At(i);
            const ScriptVal *file = e.IsTable() ? e.Find("Filename") : nullptr;
            if (!file || !file->IsText()) continue;
            const ScriptVal *alt = e.Find("ProxyFilename");
            ClipEntry entry = makeClip(file->AsText(), alt && alt->IsText() ? alt->AsText() : std::string());
            ClipPlacement &p = entry.place;
            const double length = static_cast<double>(entry.clip->Length());
            p.start = Field(e, "GlobalStart", 0);
            p.trimIn = static_cast<int>(Field(e, "TrimIn", 0));
            p.trimOut = static_cast<int>(Field(e, "TrimOut", length - 1));
            p.holdFirst = static_cast<int>(Field(e, "ExtendFirst", 0));
            p.holdLast = static_cast<int>(Field(e, "ExtendLast", 0));
            p.end = Field(e, "GlobalEnd", p.start + ElementLength(p) - 1);
            p.loop = Field(e, "Loop", 0) >= 0.5;
            p.reverse = Field(e, "Reverse", 0) >= 0.5;
            if (const ScriptVal *sf = e.Find("StartFrame"); sf && sf->IsNumber())
                entry.clip->SetStartFrame(static_cast<int64_t>(sf->AsNumber()));
            list.push_back(std::move(entry));
        }
        std::stable_sort(list.begin(), list.end(),
                         [](const ClipEntry &a, const ClipEntry &b) { return a.place.start < b.place.start; });
    } else if (auto *clip = dynamic_cast<Clip *>(req->GetInputData(inClip_)); clip && !clip->FileName().empty()) {
        auto *alt = dynamic_cast<Clip *>(req->GetInputData(inProxyClip_));
        ClipEntry entry = makeClip(clip->FileName(), alt ? alt->FileName() : std::string());
        ClipPlacement &p = entry.place;
        p.start = req->GetInputNumber(inGlobalIn_);
        p.end = req->GetInputNumber(inGlobalOut_);
        p.trimIn = static_cast<int>(req->GetInputNumber(inTrimIn_));
        p.trimOut = static_cast<int>(req->GetInputNumber(inTrimOut_));
        p.holdFirst = static_cast<int>(req->GetInputNumber(inHoldFirst_));
        p.holdLast = static_cast<int>(req->GetInputNumber(inHoldLast_));
        p.loop = req->GetInputNumber(inLoop_) >= 0.5;
        p.reverse = req->GetInputNumber(inReverse_) >= 0.5;
        list.push_back(std::move(entry));
    }
    for (ClipEntry &e : list) {
        e.place.importMode = std::clamp(s.importMode, 0, 2);
        e.place.pullType = s.pullType;
        e.place.pullFirst = s.pullFirst;
        // The clip's attributes say the same as the placement, for whoever reads the clip.
        e.clip->SetAttrsTagList({{ClipStart, e.place.start},
                                 {ClipEnd, e.place.end},
                                 {ClipInitialFrame, static_cast<double>(e.clip->InitialFrame())},
                                 {ClipLength, e.clip->Length()},
                                 {ClipTrimIn, e.place.trimIn},
                                 {ClipTrimOut, e.place.trimOut},
                                 {ClipExtendFirst, e.place.holdFirst},
                                 {ClipExtendLast, e.place.holdLast},
                                 {ClipNoLoop, !e.place.loop},
                                 {ClipReverse, e.place.reverse},
                                 {ClipImportMode, e.place.importMode},
                                 {ClipAspectMode, s.aspectMode},
                                 {ClipPullOffset, s.pullFirst},
                                 {ClipPullType, s.pullType}});
    }

    std::unique_lock lock(listLock_);
    clips_ = std::move(list);
}

std::optional<Loader::ClipEntry> Loader::ClipAt(double t) const {
    std::shared_lock lock(listLock_);
    std::vector<ClipPlacement> places;
    places.reserve(clips_.size());
    for (const ClipEntry &e : clips_) places.push_back(e.place);
    const std::optional<size_t> i = FindClipAt(places, t);
    if (!i) return std::nullopt;
    return clips_[*i];
}

Ref<Image> Loader::FetchFrame(Request *req, const ClipEntry &entry, int64_t frame, const Settings &s, bool headerOnly,
                              bool report) {
    const bool useAlt = (req->GetFlags() & ReqFlagProxy) && entry.alt;
    Clip &clip = useAlt ? *entry.alt : *entry.clip;
    TagList tags{{ClipFrameField, -1},
                 {ClipFrameProxyScale, s.proxyScale},
                 {ClipFrameQuickProxy, (req->GetFlags() & ReqFlagQuick) && s.proxyScale > 1},
                 {ClipFrameUseAlternate, useAlt},
                 {ClipFrameHeaderOnly, headerOnly}};
    if (req->GetTask()) tags.Add({ClipFrameAbort, static_cast<const void *>(req->GetTask()->AbortFlag())});
    // Only the rows asked for are decoded, when the file's pixels map one to
    // one onto the output's (no proxy shrink, no field or cadence work).
    std::optional<ImageDomain> region;
    AutoImageRoI roi(req);
    AutoImageDoD dod(req);
    if (!headerOnly && roi && s.proxyScale == 1 && s.field < 0 && s.importMode == ImportNormal) {
        region = *roi.Get();
        if (dod) region->rect = region->rect & dod->rect;
        tags.Add({ClipFrameRegion, static_cast<const void *>(&*region)});
    }
    std::string error;
    const std::string group = "Clip1.";
    Ref<Image> image = clip.GetFrameTagList(frame, tags, error, [&](ImageFormat &format) {
        std::lock_guard<std::mutex> guard(FormatLock());
        const Registry *row = format.GetRegistry();
        SetCurrentGroup(row ? group + row->ID().Text() : std::string());
        format.SetupLoad(this, req);
        SetCurrentGroup({});
    });
    // A refused allocation says more than the format's "out of memory".
    const std::string refused = TakePixelRefusal();
    if (!image && report && s.missing != MissingWait && !(req->GetTask() && req->GetTask()->IsAborted())) {
        // The clip's reason starts with the path, which the line names once.
        const std::string path = clip.FramePath(frame);
        std::string reason = refused.empty() ? error : refused;
        if (reason.rfind(path, 0) == 0) reason.erase(0, reason.find_first_not_of(": ", path.size()));
        const std::string number =
            clip.IsSequence() ? " (frame " + std::to_string(clip.SequenceNumber(frame)) + ")" : std::string();
        GetDoc()->PrintF(req, ConsoleError, "%s failed to load file \"%s\"%s : %s", Name().c_str(), path.c_str(),
                         number.c_str(), reason.c_str());
    }
    return image;
}

Ref<Image> Loader::MissingFrameColor(Request *req, const ClipEntry &entry, int64_t frame, const Settings &s) {
    // The size of the clip's frames: the header of the nearest frame that
    // exists, else the last frame read, else the document's frame format.
    long long w = 0, h = 0;
    double ax = 1.0, ay = 1.0;
    const std::vector<int64_t> &found = entry.clip->Found().frames;
    const int64_t number = entry.clip->SequenceNumber(frame);
    const auto after = std::lower_bound(found.begin(), found.end(), number);
    Settings whole = s;
    whole.proxyScale = 1;
    ClipEntry main = entry;
    main.alt.Reset();
    for (auto it : {after, after == found.begin() ? found.end() : std::prev(after)}) {
        if (it == found.end() || w > 0) continue;
        if (Ref<Image> shape = FetchFrame(req, main, *it - entry.clip->InitialFrame(), whole, true, false)) {
            w = shape->Width(), h = shape->Height();
            ax = shape->XScale(), ay = shape->YScale();
        }
    }
    if (w <= 0) {
        w = entry.clip->GetAttrL(ClipWidth, 0), h = entry.clip->GetAttrL(ClipHeight, 0);
        ax = entry.clip->GetAttrD(ClipAspectX, 1.0), ay = entry.clip->GetAttrD(ClipAspectY, 1.0);
    }
    if (w <= 0 || h <= 0 || w > 10000000 || h > 10000000) {
        const FrameFormat ff = GetDoc()->GetFrameFormat();
        w = ff.width;
        h = ff.height;
        ax = ff.aspectX;
        ay = ff.aspectY;
    }
    const int scale = std::max(1, s.proxyScale);
    TagList tags{{ImgWidth, static_cast<int>(std::max<long long>(1, w / scale))},
                 {ImgHeight, static_cast<int>(std::max<long long>(1, h / scale))},
                 {ImgXScale, ax},
                 {ImgYScale, ay},
                 {ImgDepth, DepthRGBAFlt32},
                 {ImgNoData, req->IsPreCalc()}};
    Ref<Image> image = NewImageTagList(tags);
    if (!image || req->IsPreCalc()) return image;
    if (!image->AllocScanLineData()) return Ref<Image>();
    image->Fill(FltPixel{s.color[0], s.color[1], s.color[2], s.color[3]});
    return image;
}

Ref<Image> Loader::FetchWithMissingRule(Request *req, const ClipEntry &entry, int64_t frame, const Settings &s) {
    const bool headerOnly = req->IsPreCalc();
    Ref<Image> image = FetchFrame(req, entry, frame, s, headerOnly, true);
    const RenderTask *task = req->GetTask();
    auto aborted = [task] { return task && task->IsAborted(); };
    if (image || aborted()) return image;
    switch (s.missing) {
    case MissingHoldPrevious:
        for (int64_t f = std::min<int64_t>(frame, entry.clip->Length()) - 1; f >= 0 && !image && !aborted(); --f)
            image = FetchFrame(req, entry, f, s, headerOnly, false);
        break;
    case MissingOutputColor: image = MissingFrameColor(req, entry, frame, s); break;
    case MissingWait:
        if (req->GetFlags() & ReqFlagInteractive) break;
        while (!image && !aborted()) {
            std::this_thread::sleep_for(std::chrono::milliseconds(500));
            std::string ignored;
            entry.clip->Scan(ignored);
            image = FetchFrame(req, entry, frame, s, headerOnly, false);
        }
        break;
    default: break;
    }
    return image;
}

Ref<Image> Loader::FetchPulled(Request *req, const ClipEntry &entry, int64_t frame, const Settings &s) {
    const PullPlan plan = PlanPullFrame(s.importMode, s.pullType, s.pullFirst, frame, entry.clip->Length());
    Ref<Image> first = FetchWithMissingRule(req, entry, plan.frame, s);
    if (!first || req->IsPreCalc() || (req->GetTask() && req->GetTask()->IsAborted())) return first;
    if (s.swapFields) first->ReverseFieldDominance();
    // NTSC-sized pictures (under 700 lines) store their fields in the opposite order.
    const int d = first->Height() < 700 ? 1 - plan.dominance : plan.dominance;
    if (plan.doubleField) return first->CopyField(1 - d, nullptr, 2, 3);
    if (!plan.mix) return first;
    Ref<Image> mixed = first->CopyField(1 - d, nullptr, 2, 1);
    if (!mixed) return mixed;
    Ref<Image> second = FetchFrame(req, entry, plan.frame + 1, s, false, false);
    if (!second) return first->CopyField(1 - d, nullptr, 1 - d, 3);
    if (s.swapFields) second->ReverseFieldDominance();
    second->CopyField(d, mixed.Get(), 2, 1);
    return mixed;
}

Ref<Image> Loader::ApplyAlphaOptions(Request *req, Ref<Image> image, const Settings &s) {
    const bool solid = s.solid;
    if (!(solid || s.invert || s.postMultiply) || image->DataWindow().IsNull()) return image;
    if (image->IsReadOnly()) image = CopyOfImage(image.Get());
    Image &img = *image;
    const ImgRectI dw = img.DataWindow();
    const int width = dw.Width();
    (void)req;
    const AlphaSteps steps{solid, s.invert, s.postMultiply};
    DoMultiProcessRange(
        [&](int y0, int y1) {
            for (int y = y0; y < y1; ++y) {
                if (img.IsRGBAInt64())
                    AlphaRow<Int16Alpha>(img.Row<uint16_t>(y), width, steps);
                else if (img.IsRGBAInt32())
                    AlphaRow<Int8Alpha>(img.Row<uint8_t>(y), width, steps);
                else if (img.IsRGBAFlt128())
                    AlphaRow<FloatAlpha>(img.Row<float>(y), width, steps);
                else if (img.IsRGBAFlt64())
                    AlphaRow<HalfAlpha>(img.Row<uint16_t>(y), width, steps);
            }
        },
        dw.y0, dw.y1);
    return image;
}

Ref<Image> Loader::FitFieldAndProxy(Request *req, Ref<Image> image, const Settings &s) {
    if (s.importMode == ImportNormal && s.field >= 0 && s.swapFields && !req->IsPreCalc())
        image->ReverseFieldDominance();
    if (s.aspectMode == 1 || s.aspectMode == 2) {
        const FrameFormat ff = GetDoc()->GetFrameFormat();
        const double ax = s.aspectMode == 1 ? ff.aspectX : s.customAspectX;
        const double ay = s.aspectMode == 1 ? ff.aspectY : s.customAspectY;
        image->SetScale(ax, ay);
        if (image->Attrs().Find(ImgFullXScale)) image->SetAttrsTagList({{ImgFullXScale, ax}, {ImgFullYScale, ay}});
    }
    const int fullWidth = static_cast<int>(image->GetAttrL(ImgFullWidth, image->Width()));
    int fullHeight = static_cast<int>(image->GetAttrL(ImgFullHeight, image->Height()));
    if (s.field >= 0 && s.field != image->GetAttrL(ImgField, -1) && s.importMode == ImportNormal) {
        fullHeight /= 2;
        if (!req->IsPreCalc()) {
            Ref<Image> field = image->CopyField(s.field, nullptr, -1, 1);
            if (!field) return field;
            image = field;
        }
    }
    const int scale = std::max(1, s.proxyScale);
    if (fullWidth / scale == image->Width() && fullHeight / scale == image->Height()) return image;
    const double x = static_cast<double>(image->Width()) * scale / fullWidth;
    const double y = static_cast<double>(image->Height()) * scale / fullHeight;
    constexpr double kWhole = 1.1920928955078125e-7;
    Ref<Image> out;
    if (std::floor(x) == std::floor(y) && x < 5 && std::fabs(x - std::round(x)) < kWhole &&
        std::fabs(y - std::round(y)) < kWhole && !req->IsPreCalc()) {
        out = image->ScaleOfImage(req, x, y);
    } else {
        ImageDomain dw{image->DataWindow()};
        dw.Scale(1.0 / x, 1.0 / y);
        const int w = static_cast<int>(std::floor(image->Width() / x + 0.5));
        const int h = static_cast<int>(std::floor(image->Height() / y + 0.5));
        out = NewImageTagList({{ImgLikeImage, image.Get()},
                               {ImgWidth, std::max(1, w)},
                               {ImgHeight, std::max(1, h)},
                               {ImgDataWindow, &dw.rect},
                               {ImgNoData, req->IsPreCalc()}});
        if (out && !req->IsPreCalc()) {
            const bool fast = (req->GetFlags() & ReqFlagQuick) && GetApp()->GetAttrB(AppFastScale);
            if (!out->AllocScanLineData() ||
                !image->ResizeTagList(out.Get(), {{ResizeFilter, fast ? RszBox : RszCatmullRom}, {WorkRequest, req}}))
                out.Reset();
        }
    }
    if (out) out->SetAttrsTagList({{ImgProxyScale, scale}, {ImgFullWidth, fullWidth}, {ImgFullHeight, fullHeight}});
    return out;
}

void Loader::Process(Request *req) {
    Settings s = ReadSettings(req);
    UpdateClipList(req, s);
    if (req->GetInputID(inLocalCache_) == OvID("On") && !cacheWarned_.exchange(true))
        GetDoc()->PrintF(req, ConsoleWarning,
                         "%s: the local cache is not available yet in this version of Orvane; frames are read from "
                         "their files",
                         Name().c_str());
    const double t = req->Time();
    const std::optional<ClipEntry> entry = ClipAt(t);
    if (!entry) {
        if (ClipList().empty())
            Fail(req, "%s: no file to load (the Filename is empty)", Name().c_str());
        else
            Fail(req, "%s: no clip at frame %g (the first starts later)", Name().c_str(), t);
        req->SetOutputData(outImage_, nullptr);
        return;
    }
    s.solid = s.solid || entry->clip->GetAttrB(ClipNoAlpha);
    const std::optional<int64_t> frame = FileFrameAt(entry->place, t);
    if (!frame) {
        Fail(req, "%s: the clip \"%s\" has no frame at time %g", Name().c_str(), entry->name.c_str(), t);
        req->SetOutputData(outImage_, nullptr);
        return;
    }
    Ref<Image> image = s.importMode != ImportNormal ? FetchPulled(req, *entry, *frame, s)
                                                    : FetchWithMissingRule(req, *entry, *frame, s);
    if (!image) {
        req->SetOutputData(outImage_, nullptr);
        return;
    }
    // Depth: going up happens first, so the steps below work at the finer depth.
    static const int kDepthCodes[] = {0, 0, DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32};
    int depth = s.depth == 1 ? GetDoc()->GetFrameFormat().depth : kDepthCodes[std::clamp(s.depth, 0, 5)];
    if (depth < DepthRGBAInt8 || depth > DepthRGBAFlt32) depth = 0;
    if (depth > image->Depth()) image = ConvertDepth(image.Get(), depth);
    std::string colourError;
    if (image && !req->IsPreCalc()) {
        image = gamut_->ProcessOf(req, image.Get(), image.Get(), ClippingMode_Frame,
                                  !entry->clip->GetAttrB(ClipIsLinear), &colourError);
        if (image) image = ApplyAlphaOptions(req, image, s);
    }
    if (image) image = FitFieldAndProxy(req, image, s);
    if (image && depth && depth != image->Depth()) image = ConvertDepth(image.Get(), depth);
    if (!image) {
        if (colourError.empty())
            Fail(req, "%s: out of memory", Name().c_str());
        else
            Fail(req, "%s: %s", Name().c_str(), colourError.c_str());
        req->SetOutputData(outImage_, nullptr);
        return;
    }
    if (AutoImageRoI roi(req); roi && !image->IsNoData()) image->SetValidWindow(roi->rect);
    req->SetOutputData(outImage_, image.Get());
}

} // namespace Orvane
