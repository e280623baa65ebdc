#include "host/flow/MaskOperator.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstring>
#include <memory>
#include <utility>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/Half.h"
#include "host/image/NewImage.h"
#include "host/image/PaintModes.h"
#include "host/image/PixelConvert.h"
#include "host/krom/GPUMemory.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/MaskKernelParams.h"

namespace Orvane {

const char *const MaskFilterID[MaskFilterCount] = {"Box", "Bartlett", "Multi-box", "Gaussian", "Fast Gaussian"};

int MaskFilterOf(OvID id) {
    if (id == OvID("Soften")) return MaskFilterMultiBox;
    for (int i = 0; i < MaskFilterCount; ++i)
        if (id == OvID(MaskFilterID[i])) return i;
    return MaskFilterFastGaussian;
}

void MaskFilterBlur(int filter, int passes, int &blurType, int &blurPasses) {
    static const int kinds[MaskFilterCount] = {BlurMultiBox, BlurBartlett, BlurMultiBox, BlurGaussian,
                                               BlurFastGaussian};
    blurType = kinds[std::clamp(filter, 0, MaskFilterCount - 1)];
    blurPasses = filter == MaskFilterBox ? 1 : passes;
}

namespace maskop {

/// Values closer to neutral than this (2^-23) count as neutral.
constexpr double kTiny = 1.1920928955078125e-7;

/// The single-channel depth a mask of `depth` is read at (RGBA images by their alpha).
int MaskDepthOf(int depth) { return depth > DepthAFlt32 ? depth - DepthAFlt32 : depth; }

// Rows of single-channel masks to and from floats, converting as PixelConvert does.
using LoadFn = void (*)(const uint8_t *src, int n, float *dst);
using StoreFn = void (*)(const float *src, int n, uint8_t *dst);

template <int Depth> void LoadMask(const uint8_t *src, int n, float *dst) {
    for (int x = 0; x < n; ++x) {
        if constexpr (Depth == DepthAInt8) {
            dst[x] = src[x] * (1.f / 255.f);
        } else {
            uint16_t h;
            float f;
            if constexpr (Depth == DepthAFlt32) {
                std::memcpy(&f, src + 4 * x, 4);
                dst[x] = f;
            } else {
                std::memcpy(&h, src + 2 * x, 2);
                dst[x] = Depth == DepthAInt16 ? h * (1.f / 65535.f) : HalfToFloat(h);
            }
        }
    }
}

template <int Depth> void StoreMask(const float *src, int n, uint8_t *dst) {
    for (int x = 0; x < n; ++x) {
        if constexpr (Depth == DepthAInt8) {
            dst[x] = FloatToU8(src[x]);
        } else if constexpr (Depth == DepthAFlt32) {
            std::memcpy(dst + 4 * x, &src[x], 4);
        } else {
            const uint16_t h = Depth == DepthAInt16 ? FloatToU16(src[x]) : FloatToHalf(src[x]);
            std::memcpy(dst + 2 * x, &h, 2);
        }
    }
}

constexpr LoadFn kLoads[] = {nullptr, &LoadMask<1>, &LoadMask<2>, &LoadMask<3>, &LoadMask<4>};
constexpr StoreFn kStores[] = {nullptr, &StoreMask<1>, &StoreMask<2>, &StoreMask<3>, &StoreMask<4>};

/// Row y of `img`, columns x0..x1-1, as mask values: pixels inside its data
/// window, its canvas value outside. `scratch` serves RGBA images.
void LoadMaskSpan(const Image &img, LoadFn load, int y, int x0, int x1, float *dst, std::vector<FltPixel> &scratch) {
    const ImgRectI &dw = img.DataWindow();
    const float canvas = img.GetCanvasColor().A;
    const uint8_t *row = img.ScanLine(y);
    const int left = row ? std::clamp(dw.x0, x0, x1) : x1, right = row ? std::clamp(dw.x1, left, x1) : x1;
    std::fill(dst, dst + (left - x0), canvas);
    const uint8_t *from = row ? row + static_cast<size_t>(left - dw.x0) * img.BytesPerPixel() : nullptr;
    if (right > left && load) {
        load(from, right - left, dst + (left - x0));
    } else if (right > left) {
        scratch.resize(right - left);
        LoadFlt(img.Depth(), from, right - left, scratch.data());
        for (int x = left; x < right; ++x) dst[x - x0] = scratch[x - left].A;
    }
    std::fill(dst + (right - x0), dst + (x1 - x0), canvas);
}

bool Aborted(const Request *req, const Image *img) {
    return img->CheckAbort() || (req && req->GetTask() && req->GetTask()->IsAborted());
}

} // namespace maskop

using namespace maskop;

void MaskControls::Add(Operator *op) {
    const TagList number{{LinkDataType, CLSID_DataType_Number}};
    auto with = [&number](std::initializer_list<TagItem> more) {
        TagList t = number;
        for (const TagItem &item : more) t.Add(item);
        return t;
    };
    level = op->AddInputTagList("Level", "Level",
                                with({{InputControl, CLSID_InputControl_Slider},
                                      {InputDefault, 1.0},
                                      {InputMinAllowed, 0.0},
                                      {InputMaxAllowed, 1.0}}));
    // The default filter is the document's preference (Fast Gaussian unless set).
    const long pref = op->GetDoc() ? op->GetDoc()->GetPrefLong(PREF_MaskFilter) : long{MaskFilterFastGaussian};
    const int defaultFilter = pref >= 0 && pref < MaskFilterCount ? static_cast<int>(pref) : MaskFilterFastGaussian;
    TagList filterTags{{LinkDataType, CLSID_DataType_OvID},
                       {InputControl, CLSID_InputControl_MultiButtonID},
                       {ButtonsFillRow, 1},
                       {ControlWidth, 0.5},
                       {InputDefaultId, OvID(MaskFilterID[defaultFilter])},
                       {InputNotify, 1},
                       {InputPriority, PriorityLast}};
    for (const char *id : MaskFilterID) {
        filterTags.Add({ListAddItem, id});
        filterTags.Add({ListItemId, OvID(id)});
    }
    filterTags.Add({ListAcceptedId, OvID("Soften")}); // older documents; read as Multi-box
    filter = op->AddInputTagList("Filter", "Filter", filterTags);
    softEdge = op->AddInputTagList("Soft Edge", "SoftEdge",
                                   with({{InputControl, CLSID_InputControl_Slider},
                                         {InputDefault, 0.0},
                                         {InputMinAllowed, 0.0},
                                         {InputMaxAllowed, 1.0},
                                         {InputSliderLow, 0.0},
                                         {InputSliderHigh, 0.2},
                                         {InputPriority, PriorityLast}}));
    passes = op->AddInputTagList("Num Passes", "Passes",
                                 with({{InputControl, CLSID_InputControl_Slider},
                                       {InputInteger, 1},
                                       {InputDefault, 4.0},
                                       {InputMinAllowed, 1.0},
                                       {InputMaxAllowed, 64.0},
                                       {InputSliderLow, 1.0},
                                       {InputSliderHigh, 16.0},
                                       {InputPriority, PriorityLast},
                                       {ControlVisible, defaultFilter == MaskFilterMultiBox}}));
    borderWidth = op->AddInputTagList("Border Width", "BorderWidth",
                                      with({{InputControl, CLSID_InputControl_Slider},
                                            {InputDefault, 0.0},
                                            {InputMinAllowed, -1.0},
                                            {InputMaxAllowed, 1.0},
                                            {InputSliderLow, -0.2},
                                            {InputSliderHigh, 0.2}}));
    TagList modeTags{{LinkDataType, CLSID_DataType_OvID},
                     {InputControl, CLSID_InputControl_ComboID},
                     {InputDefaultId, OvID(PaintModeID[PaintMerge])}};
    for (int i = 0; i < PaintModeCount; ++i) {
        modeTags.Add({ListAddItem, PaintModeName[i]});
        modeTags.Add({ListItemId, OvID(PaintModeID[i])});
    }
    paintMode = op->AddInputTagList("Paint Mode", "PaintMode", modeTags);
    invert = op->AddInputTagList(
        "Invert", "Invert",
        with({{InputControl, CLSID_InputControl_Checkbox}, {InputDefault, 0.0}, {ControlWidth, 0.5}}));
    solid = op->AddInputTagList(
        "Solid", "Solid",
        with(
            {{InputControl, CLSID_InputControl_Checkbox}, {InputDefault, 1.0}, {ControlWidth, 0.5}, {InputNotify, 1}}));
    // Icon buttons: (label, icon) pairs; the value is the button's index.
    using Buttons = std::initializer_list<std::pair<const char *, const char *>>;
    auto iconButtons = [&with](Buttons buttons, const char *label) {
        TagList t = with({{InputControl, CLSID_InputControl_MultiButton},
                          {InputDefault, 0.0},
                          {InputMinAllowed, 0.0},
                          {InputMaxAllowed, static_cast<double>(buttons.size() - 1)},
                          {InputInteger, 1}});
        if (label) t.Set({ControlLabel, label});
        for (const auto &[name, icon] : buttons) {
            t.Add({ListAddItem, name});
            t.Add({ButtonIcon, icon});
        }
        return t;
    };
    TagList join = iconButtons({{"Bevel", "Icons.Outline.JoinBevel"},
                                {"Round", "Icons.Outline.JoinRound"},
                                {"Miter", "Icons.Outline.JoinMiter"},
                                {"Miter Clip", "Icons.Outline.JoinMiterClip"}},
                               "Border Style");
    join.Set({InputNotify, 1});
    joinStyle = op->AddInputTagList("Join Style", "JoinStyle", join);
    miterLimit = op->AddInputTagList("Miter Limit", "MiterLimit",
                                     with({{InputControl, CLSID_InputControl_Slider},
                                           {InputDefault, 10.0},
                                           {InputSliderLow, 0.0},
                                           {InputSliderHigh, 10.0},
                                           {SliderRest, 4.0}}));
    capStyle = op->AddInputTagList("Cap Style", "CapStyle",
                                   iconButtons({{"Flat", "Icons.Outline.CapButt"},
                                                {"Rounded", "Icons.Outline.CapRound"},
                                                {"Square", "Icons.Outline.CapSquare"}},
                                               nullptr));
    for (int end = 0; end < 2; ++end)
        (end ? writeLength : writePosition) =
            op->AddInputTagList(end ? "Length" : "Position", end ? "WriteLength" : "WritePosition",
                                with({{InputControl, CLSID_InputControl_Range},
                                      {ControlRowLabel, "WriteOnStart"},
                                      {ControlGroup, 40},
                                      {ControlMember, end},
                                      {InputDefault, end ? 1.0 : 0.0},
                                      {InputSliderLow, 0.0},
                                      {InputSliderHigh, 1.0}}));
}

MaskOperator::MaskOperator(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Controls")}});
    controls_.Add(this);
    output_ = AddOutputTagList("Mask", "Mask", {{LinkDataType, CLSID_DataType_Mask}, {LinkMain, 1}});
}

void MaskOperator::FinishConstruction() {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    const int page = AddControlPageTagList("Image", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Image")}});
    static const char *const sizeIds[2] = {"MaskWidth", "MaskHeight"}; // the shapes have a Width and Height
    formatInputs_.Add(this, page, ff, true, true, true, sizeIds);
    ThreadedOperator::FinishConstruction();
}

void MaskControls::NotifyChanged(Input *in, Parameter *param) {
    if (in == filter)
        if (const auto *id = dynamic_cast<const IDValue *>(param)) {
            const int kind = MaskFilterOf(id->value);
            passes->SetAttrsTagList({{ControlVisible, kind == MaskFilterMultiBox}});
            // An older document's "Soften" becomes the Multi-box it always was.
            if (id->value == OvID("Soften") && !filter->Link() && !filter->IsAnimated())
                filter->SetValue(MakeRef<IDValue>(OvID(MaskFilterID[MaskFilterMultiBox])));
        }
}

void MaskOperator::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    controls_.NotifyChanged(in, param);
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

MaskFormat MaskOperator::GetMaskFormat(Request *req) const {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    const ImageFormatInputs::Values v = formatInputs_.Read(req, ff);
    MaskFormat f;
    // Default: the document's frame depth, as one channel.
    f.depth = std::clamp(v.depthChoice > 0 ? v.depthChoice : MaskDepthOf(ff.depth), 1, 4);
    // Limiting another tool's image, the mask takes that image's frame (already at the proxy scale).
    if (const AutoImageRoI roi(req); roi && roi->HasFrame()) {
        f.width = roi->FrameWidth(), f.height = roi->FrameHeight();
        f.aspectX = roi->xScale, f.aspectY = roi->yScale;
        return f;
    }
    const int proxy = std::max(1, req->ProxyScale());
    f.width = std::max(1, v.width / proxy);
    f.height = std::max(1, v.height / proxy);
    f.aspectX = v.aspectX;
    f.aspectY = v.aspectY;
    return f;
}

MaskMergeSettings MaskControls::MergeSettings(Request *req) const {
    MaskMergeSettings s;
    s.paintMode = PaintModeIndex(req->GetInputID(paintMode, OvID(PaintModeID[PaintMerge])).Text());
    s.level = req->GetInputNumber(level, 1.0);
    s.filter = MaskFilterOf(req->GetInputID(filter, OvID(MaskFilterID[MaskFilterFastGaussian])));
    s.softEdge = req->GetInputNumber(softEdge, 0.0);
    s.passes = static_cast<int>(req->GetInputNumber(passes, 4.0));
    return s;
}

MaskMergeSettings MaskOperator::GetMergeSettings(Request *req) const {
    MaskMergeSettings s = HoldsIncomingMask() ? MaskMergeSettings{} : controls_.MergeSettings(req);
    s.clipToFrame = GetClippingMode(req) == ClippingMode_Frame;
    return s;
}

int MaskOperator::SoftEdgeReach(const MaskMergeSettings &s, const MaskFormat &f) const {
    if (!(s.softEdge > kTiny)) return 0;
    int type = 0, passes = 1;
    MaskFilterBlur(s.filter, s.passes, type, passes);
    ImageDomain d(f.Frame());
    d.frame = f.Frame();
    d.xScale = f.aspectX;
    d.yScale = f.aspectY;
    double x = s.softEdge, y = s.softEdge;
    if (!Image::GetBlurSupport(type, &d, x, y, passes)) return std::max(f.width, f.height);
    return static_cast<int>(std::ceil(std::max(x, y))) + 1;
}

ImgRectI MaskOperator::NeededRect(Request *req, const ImgRectI &frame) const {
    const AutoImageRoI roi(req);
    if (!roi) return frame;
    ImgRectI r = roi->rect;
    if (IsEndlessSide(r.x0)) r.x0 = frame.x0;
    if (IsEndlessSide(r.y0)) r.y0 = frame.y0;
    if (IsEndlessSide(r.x1)) r.x1 = frame.x1;
    if (IsEndlessSide(r.y1)) r.y1 = frame.y1;
    return r;
}

std::optional<ImgRectI> MaskOperator::GetMaskDoD(Request *req) const {
    const MaskFormat f = GetMaskFormat(req);
    const ImgRectI r = NeededRect(req, f.Frame());
    if (r.IsNull()) return std::nullopt;
    const int reach = SoftEdgeReach(GetMergeSettings(req), f);
    return r.Grown(reach, reach);
}

void MaskOperator::SetMaskRegion(Request *, const ImgRectI &rect) { region_ = rect; }

Image *MaskOperator::GetMaskImage(Request *) const { return mask_.Get(); }

void MaskOperator::SetMaskImage(Request *, Ref<Image> mask) { mask_ = std::move(mask); }

Ref<Image> MaskOperator::CreateMaskImage(Request *req, const TagList &tags) {
    const MaskFormat f = GetMaskFormat(req);
    ImgRectI window;
    if (const ImgRectI needed = NeededRect(req, f.Frame()); !needed.IsNull()) {
        const int reach = static_cast<int>(tags.GetLong(MaskReach, SoftEdgeReach(GetMergeSettings(req), f)));
        window = needed.Grown(reach, reach);
        if (const auto *region = static_cast<const ImgRectI *>(tags.GetPtr(MaskRegion)))
            window = region->IsNull() ? ImgRectI() : region->Grown(reach, reach) & window;
    }
    const bool noData = req->IsPreCalc();
    Ref<Image> mask = NewImageTagList({{ImgWidth, f.width},
                                       {ImgHeight, f.height},
                                       {ImgDepth, tags.GetLong(MaskDepth, f.depth)},
                                       {ImgXScale, f.aspectX},
                                       {ImgYScale, f.aspectY},
                                       {ImgDataWindow, &window},
                                       {ImgNoData, noData},
                                       {ImgForRequest, 1},
                                       {ImgTakeWindows, 1}});
    if (!mask || !mask->IsMask() || (!noData && !window.IsNull() && !mask->AllocScanLineData())) return nullptr;
    SetMaskImage(req, mask);
    return mask;
}

void MaskOperator::PreProcess(Request *req) {
    TagList tags;
    if (region_) tags.Set({MaskRegion, &*region_});
    Ref<Image> mask = CreateMaskImage(req, tags);
    region_.reset();
    if (!mask) {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    // Handing the mask over now lets PostProcess finish it after the tool's Process.
    req->SetOutputData(output_, mask);
}

void MaskOperator::PostProcess(Request *req) {
    Ref<Image> mask = std::move(mask_);
    mask_ = nullptr;
    if (!mask) mask = Ref<Image>(dynamic_cast<Image *>(req->GetOutputData(output_)));
    if (!mask) return;
    Image *incoming = Common().effectMask ? dynamic_cast<Image *>(req->GetInputData(Common().effectMask)) : nullptr;
    // A tool that merged the incoming mask as it went hands it on as it came, or finishes its own without it.
    if (HoldsIncomingMask()) {
        if (mask.Get() == incoming) {
            req->SetOutputData(output_, mask);
            return;
        }
        incoming = nullptr;
    }
    const ImgRectI valid = NeededRect(req, GetMaskFormat(req).Frame());
    Ref<Image> result = MergeMasks(req, std::move(mask), incoming, GetMergeSettings(req), valid);
    if (!result) {
        if (!(req->GetTask() && req->GetTask()->IsAborted())) FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    // A mask handed on unchanged keeps what its own maker recorded.
    if (result.Get() != incoming) {
        if (req->GetFlags() & ReqFlagMaskDomain) result->Metadata().Set(MaskDomainKey, ScriptVal(true));
        const AutoImageRoI roi(req);
        result->SetValidWindow(roi ? roi->rect : ImageDomain::Endless().rect);
    }
    req->SetOutputData(output_, result);
}

Ref<Image> MaskOperator::SoftEdgeOf(Request *req, Image *mask, int depth, const MaskMergeSettings &s) {
    ImgRectI window = mask->DataWindow();
    if (s.clipToFrame) window &= mask->Frame();
    const FltPixel canvas = mask->GetCanvasColor();
    Ref<Image> soft = NewImageTagList({{ImgLikeImage, mask},
                                       {ImgDepth, depth},
                                       {ImgDataWindow, &window},
                                       {ImgNoData, req->IsPreCalc()},
                                       {ImgCanvasColor, &canvas}});
    if (!soft || req->IsPreCalc()) return soft;
    soft->SetScale(mask->XScale(), mask->YScale());
    int type = 0, passes = 1;
    MaskFilterBlur(s.filter, s.passes, type, passes);
    const ImgRectI frame = mask->Frame();
    TagList tags{{BlurFilterType, type},
                 {BlurPasses, passes},
                 {BlurXSize, s.softEdge},
                 {BlurYSize, s.softEdge},
                 {WorkRequest, static_cast<const void *>(req)}};
    if (s.clipToFrame) tags.Set({BlurSourceWindow, &frame});
    // The device blurs when masks already live there, or for the filter that runs best there.
    if (IsGPUEnabled(req, false) && (mask->GetGPUMem() || type == BlurFastGaussian)) tags.Set({WorkUseGPU, 1});
    if (!mask->BlurTagList(soft.Get(), tags)) return nullptr;
    return soft;
}

Ref<Image> MaskOperator::MergeMasks(Request *req, Ref<Image> mask, Image *incoming, const MaskMergeSettings &s,
                                    const ImgRectI &valid) {
    if (!mask) return nullptr;
    if (s.paintMode == PaintNone) {
        if (incoming) return Ref<Image>(incoming);
        const ImgRectI none;
        return NewImageTagList({{ImgLikeImage, mask.Get()}, {ImgDataWindow, &none}, {ImgNoData, 1}});
    }
    const int inDepth = incoming ? MaskDepthOf(incoming->Depth()) : 0;
    const int depth = std::max(mask->Depth(), inDepth);
    if (s.softEdge > kTiny && !mask->DataWindow().IsNull()) {
        mask = SoftEdgeOf(req, mask.Get(), depth, s);
        if (!mask) return nullptr;
    }
    const ImgRectI window = (mask->DataWindow() | (incoming ? incoming->DataWindow() : ImgRectI())) & valid;
    // An empty clear mask merged over another changes nothing.
    if (incoming && inDepth <= mask->Depth() && mask->DataWindow().IsNull() && mask->IsCanvasColorClear() &&
        s.paintMode == PaintMerge)
        return Ref<Image>(incoming);
    if (inDepth > mask->Depth() || !(window == mask->DataWindow())) {
        mask = ChangeDataWindowAndDepth(req, mask.Get(), incoming, depth, &window);
        if (!mask) return nullptr;
    }
    const int mode = incoming ? s.paintMode : PaintCopy;
    const float level = static_cast<float>(s.level);
    if ((incoming || level != 1.f) && !req->IsPreCalc() && !mask->DataWindow().IsNull()) {
        const bool sameSide = !mask->GetGPUMem() == !(incoming && incoming->GetGPUMem());
        const bool onDevice = IsGPUEnabled(req, true) && sameSide && MergeGPU(req, mask.Get(), incoming, mode, level);
        if (!onDevice && !MergeCPU(req, mask.Get(), incoming, mode, level)) return nullptr;
    }
    const float inCanvas = incoming ? incoming->GetCanvasColor().A : 0.f;
    mask->SetCanvasColorFltChan(3, Merge_Flt32_Flt32_Pixel(mode, level, inCanvas, mask->GetCanvasColor().A));
    return mask;
}

Ref<Image> MaskOperator::ChangeDataWindowAndDepth(Request *req, Image *mask, const Image *incoming, int depth,
                                                  const ImgRectI *window) {
    if (!mask) return nullptr;
    const int inDepth = incoming ? MaskDepthOf(incoming->Depth()) : 0;
    const int toDepth = depth > 0 ? depth : std::max(mask->Depth(), inDepth);
    const ImgRectI to = window ? *window : mask->DataWindow() | (incoming ? incoming->DataWindow() : ImgRectI());
    const FltPixel canvas = mask->GetCanvasColor();
    const bool noData = req->IsPreCalc() || mask->IsNoData();
    Ref<Image> out = NewImageTagList({{ImgLikeImage, mask},
                                      {ImgDepth, toDepth},
                                      {ImgDataWindow, &to},
                                      {ImgNoData, noData},
                                      {ImgCanvasColor, &canvas}});
    if (!out) return nullptr;
    out->SetScale(mask->XScale(), mask->YScale());
    if (noData || to.IsNull()) return out;
    if (!mask->DownloadGPUMem() || !out->AllocScanLineData()) return nullptr;
    out->ImageCopy(mask);
    return Aborted(req, mask) ? nullptr : out;
}

bool MaskOperator::MergeCPU(Request *req, Image *mask, const Image *incoming, int mode, double level) {
    if (!mask || !mask->IsMask() || !mask->DownloadGPUMem() || (incoming && !incoming->DownloadGPUMem())) return false;
    const ImgRectI dw = mask->DataWindow();
    if (dw.IsNull()) return true;
    if (!mask->HasScanLineData() && !mask->AllocScanLineData()) return false;
    mask->SetGPUMem(nullptr, false); // the rows change: a device copy would be stale
    const LoadFn loadMask = kLoads[mask->Depth()];
    const StoreFn storeMask = kStores[mask->Depth()];
    const LoadFn loadIn = incoming && incoming->IsMask() ? kLoads[incoming->Depth()] : nullptr;
    const float l = static_cast<float>(level);
    std::atomic<bool> stopped{false};
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            const int w = dw.Width();
            std::vector<float> m(w), in(w, 0.f);
            std::vector<FltPixel> scratch;
            for (int y = y0; y < y1; ++y) {
                if (Aborted(req, mask)) {
                    stopped = true;
                    return;
                }
                uint8_t *row = mask->ScanLine(y);
                loadMask(row, w, m.data());
                if (incoming) LoadMaskSpan(*incoming, loadIn, y, dw.x0, dw.x1, in.data(), scratch);
                MergeSpanFlt32(mode, l, in.data(), m.data(), w);
                storeMask(m.data(), w, row);
            }
        },
        4);
    return !stopped;
}

bool MaskOperator::MergeGPU(Request *req, Image *mask, const Image *incoming, int mode, double level) {
    if (!req || !mask || !mask->IsMask() || mask->DataWindow().IsNull() || (incoming && !incoming->IsMask()))
        return false;
    auto block = std::make_shared<MaskMergeParams>();
    MaskMergeParams &p = *block;
    p.mode = mode;
    p.level = static_cast<float>(level);
    p.inCanvas = incoming ? incoming->GetCanvasColor().A : 0.f;
    const ImgRectI mw = mask->DataWindow();
    const bool inPixels = incoming && (incoming->HasScanLineData() || incoming->IsGPUMemDirty());
    const ImgRectI iw = inPixels ? incoming->DataWindow() : ImgRectI();
    const int maskWindow[4] = {mw.x0, mw.x1, mw.y0, mw.y1}, inWindow[4] = {iw.x0, iw.x1, iw.y0, iw.y1};
    std::memcpy(p.maskWindow, maskWindow, sizeof maskWindow);
    std::memcpy(p.inWindow, inWindow, sizeof inWindow);
    p.workSize[0] = mw.Width();
    p.workSize[1] = mw.Height();
    // Without pixels below, the mask itself stands in as the (unread) incoming texture.
    const Image *below = inPixels ? incoming : mask;
    return KROMComputeNode::ExecKernelI(req, "MaskMerge", nullptr, MaskMergeParamsText, sizeof p,
                                        offsetof(MaskMergeParams, srcCompOrder),
                                        offsetof(MaskMergeParams, dstCompOrder), block,
                                        {{"mask", mask}, {"incoming", const_cast<Image *>(below)}, {"output", mask}});
}

} // namespace Orvane
