// The common controls the host adds to every tool and applies after its
// Process: Blend, the per-channel process switches, and the effect mask.
//
//   w    = Blend x m, where m is the effect mask's chosen channel at the pixel
//          (clamped to 0..1, inverted when asked; 1 without a mask)
//   out  = in + (result - in) x w            per channel that is switched on
//   out  = in + (result x m - in) x Blend    with "Multiply By Mask"
//   out  = in                                per channel that is switched off
//
// `in` is the tool's main image input (transparent black for tools without
// one). Outside every data window the same rule runs on the canvas colours,
// so the output's canvas stays exact.
//
// Tools with an image output also get the motion blur controls; the engine
// applies them around the whole request (MotionBlur.h).
#include <algorithm>
#include <iterator>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/image/TransformMatrix.h"

namespace Orvane {
namespace {

constexpr const char *CommonPageName = "Common Controls";

enum MaskChannel { MaskAlpha, MaskRed, MaskGreen, MaskBlue, MaskLuminance };

float MaskValue(const FltPixel &p, int channel, bool invert) {
    float m;
    switch (channel) {
    case MaskRed: m = p.R; break;
    case MaskGreen: m = p.G; break;
    case MaskBlue: m = p.B; break;
    case MaskLuminance: m = 0.2126f * p.R + 0.7152f * p.G + 0.0722f * p.B; break;
    default: m = p.A; break;
    }
    m = std::clamp(m, 0.f, 1.f);
    return invert ? 1.f - m : m;
}

struct Mix {
    float blend;
    bool process[4];
    bool multiply;
    int channel;
    bool invert;

    FltPixel operator()(const FltPixel &in, const FltPixel &res, const FltPixel *maskPx) const {
        const float m = maskPx ? MaskValue(*maskPx, channel, invert) : 1.f;
        const float w = multiply ? blend : blend * m;
        const float k = multiply ? m : 1.f;
        const float i[4] = {in.R, in.G, in.B, in.A}, r[4] = {res.R, res.G, res.B, res.A};
        float o[4];
        for (int c = 0; c < 4; ++c) o[c] = process[c] ? i[c] + (r[c] * k - i[c]) * w : i[c];
        return {o[0], o[1], o[2], o[3]};
    }
};

} // namespace

void Operator::FinishConstruction() {
    // Mask tools (RegKindMask) merge the mask on their EffectMask input with
    // their own (MaskOperator.h): no Blend or channel switches, no mixing by
    // the mask; their clipping mode bounds the soft edge.
    const uint32_t kind = GetRegistry() ? static_cast<uint32_t>(GetRegistry()->Tags().GetLong(RegTypeFlags, 0)) : 0;
    const bool maskTool = (kind & (RegKindOperator | RegKindMask)) == (RegKindOperator | RegKindMask);
    // Blend, channel switches and the effect mask act on images: a tool whose outputs are numbers or points (a
    // modifier) has none.
    const bool imageOutput = std::any_of(Outputs().begin(), Outputs().end(),
                                         [](const auto &out) { return IsImageDataType(out->DataType()); });
    const bool blend = imageOutput && !RegAttrB(RegNoBlendControls) && !maskTool;
    const bool mask = imageOutput && !RegAttrB(RegNoEffectMask);
    const Input *mainIn = FindMainInput(1);
    const bool clipping = (maskTool || (mainIn && mainIn->DataType() == CLSID_DataType_Image)) &&
                          RegAttrB(RegSupportsDoD) && !FindInput("ClippingMode");
    // Motion blur for tools with an image output, unless one of its IDs is taken.
    static const char *const motionIds[] = {"MotionBlur", "MotionBlurQuality", "MotionBlurShutterAngle",
                                            "MotionBlurCenterBias", "MotionBlurSampleSpread"};
    const Output *mainOut = FindMainOutput();
    const bool motion = !RegAttrB(RegNoMotionBlurControls) && mainOut && IsImageDataType(mainOut->DataType()) &&
                        std::none_of(std::begin(motionIds), std::end(motionIds),
                                     [this](const char *id) { return FindInput(id) != nullptr; });
    if (!blend && !mask && !clipping && !motion) return;
    const int page = AddControlPageTagList(CommonPageName, {});
    if (clipping)
        common_.clippingMode = AddInputTagList("Clipping Mode", "ClippingMode",
                                               {{LinkDataType, CLSID_DataType_OvID},
                                                {InputControl, CLSID_InputControl_MultiButtonID},
                                                {ControlPage, page},
                                                {ButtonsFillRow, 1},
                                                {InputDefaultId, ClippingMode_None},
                                                {ListAddItem, "None"},
                                                {ListItemId, ClippingMode_None},
                                                {ListAddItem, "Domain"},
                                                {ListItemId, ClippingMode_Domain},
                                                {ListAddItem, "Frame"},
                                                {ListItemId, ClippingMode_Frame}});
    if (blend) {
        common_.blend = AddInputTagList("Blend", "Blend",
                                        {{LinkDataType, CLSID_DataType_Number},
                                         {InputControl, CLSID_InputControl_Slider},
                                         {ControlPage, page},
                                         {InputDefault, 1.0},
                                         {InputMinAllowed, 0.0},
                                         {InputMaxAllowed, 1.0},
                                         {SliderSteps, 101}});
        static const char *const ids[4] = {"ProcessRed", "ProcessGreen", "ProcessBlue", "ProcessAlpha"};
        static const char *const labels[4] = {"Process Red", "Process Green", "Process Blue", "Process Alpha"};
        for (int c = 0; c < 4; ++c)
            common_.process[c] = AddInputTagList(labels[c], ids[c],
                                                 {{LinkDataType, CLSID_DataType_Number},
                                                  {InputControl, CLSID_InputControl_Checkbox},
                                                  {ControlPage, page},
                                                  {ControlGroup, 20},
                                                  {ControlMember, c},
                                                  {InputDefault, 1.0},
                                                  {ControlWidth, 0.25}});
    }
    if (mask) {
        common_.effectMask = AddInputTagList("Effect Mask", "EffectMask",
                                             {{LinkDataType, CLSID_DataType_Mask},
                                              {InputPriority, PriorityMask},
                                              {InputRequired, 0},
                                              {ControlPage, page},
                                              {LinkMain, 100}});
    }
    if (mask && !maskTool) {
        common_.maskChannel = AddInputTagList("Mask Channel", "EffectMaskChannel",
                                              {{LinkDataType, CLSID_DataType_Number},
                                               {InputControl, CLSID_InputControl_Combo},
                                               {ControlPage, page},
                                               {InputInteger, 1},
                                               {InputMinAllowed, 0.0},
                                               {InputMaxAllowed, 4.0},
                                               {ListAddItem, "Alpha"},
                                               {ListAddItem, "Red"},
                                               {ListAddItem, "Green"},
                                               {ListAddItem, "Blue"},
                                               {ListAddItem, "Luminance"}});
        common_.maskInvert = AddInputTagList(
            "Invert Mask", "EffectMaskInvert",
            {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Checkbox}, {ControlPage, page}});
        common_.multiplyByMask = AddInputTagList(
            "Multiply By Mask", "MultiplyByMask",
            {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Checkbox}, {ControlPage, page}});
    }
    if (motion) {
        common_.motionBlur = AddInputTagList(
            "Motion Blur", motionIds[0],
            {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Checkbox}, {ControlPage, page}});
        common_.motionQuality = AddInputTagList("Quality", motionIds[1],
                                                {{LinkDataType, CLSID_DataType_Number},
                                                 {InputControl, CLSID_InputControl_Slider},
                                                 {ControlPage, page},
                                                 {InputInteger, 1},
                                                 {InputDefault, 2.0},
                                                 {InputMinAllowed, 1.0},
                                                 {InputMaxAllowed, 256.0},
                                                 {InputSliderLow, 1.0},
                                                 {InputSliderHigh, 10.0},
                                                 {SliderSteps, 10}});
        common_.shutterAngle = AddInputTagList("Shutter Angle", motionIds[2],
                                               {{LinkDataType, CLSID_DataType_Number},
                                                {InputControl, CLSID_InputControl_Slider},
                                                {ControlPage, page},
                                                {InputDefault, 180.0},
                                                {InputMinAllowed, 0.0},
                                                {InputMaxAllowed, 360.0},
                                                {SliderSteps, 361}});
        common_.centerBias = AddInputTagList("Center Bias", motionIds[3],
                                             {{LinkDataType, CLSID_DataType_Number},
                                              {InputControl, CLSID_InputControl_Slider},
                                              {ControlPage, page},
                                              {InputDefault, 0.0},
                                              {InputMinAllowed, -1.0},
                                              {InputMaxAllowed, 1.0},
                                              {SliderSteps, 201}});
        common_.sampleSpread = AddInputTagList("Sample Spread", motionIds[4],
                                               {{LinkDataType, CLSID_DataType_Number},
                                                {InputControl, CLSID_InputControl_Slider},
                                                {ControlPage, page},
                                                {InputDefault, 1.0},
                                                {InputMinAllowed, 0.0},
                                                {InputMaxAllowed, 1.0},
                                                {SliderSteps, 101}});
    }
}

OvID Operator::GetClippingMode(const Request *req) const {
    const Input *in = common_.clippingMode ? common_.clippingMode : FindInput("ClippingMode");
    const auto *id = in ? dynamic_cast<const IDValue *>(req->GetInputData(in)) : nullptr;
    return id && !id->value.IsNull() ? id->value : ClippingMode_None;
}

void Operator::PostProcess(Request *req) {
    Output *out = FindMainOutput();
    if (!out) return;
    Parameter *value = req->GetOutputData(out);
    if (!dynamic_cast<Image *>(value) && !dynamic_cast<TransformMatrix *>(value)) return;

    Mix mix;
    mix.blend = static_cast<float>(req->GetInputNumber(common_.blend, 1.0));
    bool allChannels = true;
    for (int c = 0; c < 4; ++c) {
        mix.process[c] = req->GetInputNumber(common_.process[c], 1.0) >= 0.5;
        allChannels = allChannels && mix.process[c];
    }
    mix.multiply = req->GetInputNumber(common_.multiplyByMask, 0.0) >= 0.5;
    mix.channel = static_cast<int>(req->GetInputNumber(common_.maskChannel, 0.0) + 0.5);
    mix.invert = req->GetInputNumber(common_.maskInvert, 0.0) >= 0.5;
    const Image *mask =
        common_.effectMask ? dynamic_cast<const Image *>(req->GetInputData(common_.effectMask)) : nullptr;
    if (mix.blend == 1.f && allChannels && !mask) return;

    // The mix works on pixels: a pending transform (the tool's own output,
    // or its main input where it takes transforms) is made into pixels
    // first, over the request's region.
    const AutoImageRoI region(req);
    TagList pixelTags{{WorkRequest, static_cast<const void *>(req)}};
    if (region) pixelTags.Set({ImgDataWindow, &region->rect});
    const Input *mainIn = FindMainInput(1);
    Parameter *srcValue = mainIn ? req->GetInputData(mainIn) : nullptr;
    if (srcValue == value) return; // passed through: nothing to mix
    const Ref<Image> resultPixels = ImageOfValue(value, pixelTags);
    const Ref<Image> srcPixels = srcValue ? ImageOfValue(srcValue, pixelTags) : nullptr;
    if (!resultPixels || (srcValue && !srcPixels && dynamic_cast<TransformMatrix *>(srcValue))) {
        if (!(req->GetTask() && req->GetTask()->IsAborted())) FailOutOfMemory(req);
        req->SetOutputData(out, nullptr);
        return;
    }
    Image *result = resultPixels.Get();
    const Image *src = srcPixels.Get();
    if (src == result) return; // passed through: nothing to mix
    // The mix runs on rows: images made on the device come back first.
    if (!result->DownloadGPUMem() || (src && !src->DownloadGPUMem()) || (mask && !mask->DownloadGPUMem())) {
        Fail(req, "%s: an image could not be brought back from the device (time = %f)\n", Name().c_str(), req->Time());
        req->SetOutputData(out, nullptr);
        return;
    }

    const FltPixel clear{};
    const FltPixel srcCanvas = src ? src->GetCanvasColor() : clear;
    const FltPixel maskCanvas = mask ? mask->GetCanvasColor() : FltPixel{1, 1, 1, 1};
    const FltPixel canvas = mix(srcCanvas, result->GetCanvasColor(), mask ? &maskCanvas : nullptr);

    ImgRectI dw = result->DataWindow();
    if (src) dw |= src->DataWindow();
    // Beyond both windows the mask still matters where canvas and mask meet:
    // when the canvases differ, or when the mask multiplies a result canvas.
    if (mask && (!(srcCanvas == result->GetCanvasColor()) || (mix.multiply && !result->IsCanvasColorClear())))
        dw |= mask->DataWindow();
    if (const AutoImageRoI roi(req); roi) dw &= roi->rect;

    Ref<Image> mixed = NewImageTagList({{ImgLikeImage, result},
                                        {ImgDataWindow, &dw},
                                        {ImgValidWindow, &dw},
                                        {ImgNoData, req->IsPreCalc() || result->IsNoData()},
                                        {ImgCanvasColor, &canvas}});
    if (!mixed) return;
    mixed->SetScale(result->XScale(), result->YScale());
    if (!mixed->IsNoData()) {
        if (!mixed->AllocScanLineData()) {
            FailOutOfMemory(req);
            req->SetOutputData(out, nullptr);
            return;
        }
        const Image emptySource(1, 1, DepthRGBAFlt32); // stands for "no input": canvas everywhere
        const Image &in = src ? *src : emptySource;
        ParallelRange(
            dw.y0, dw.y1,
            [&](int y0, int y1) {
                const int w = dw.Width();
                std::vector<FltPixel> a(w), r(w), m(mask ? w : 0);
                for (int y = y0; y < y1; ++y) {
                    if (result->CheckAbort()) return;
                    ReadSpanFlt(in, y, dw.x0, dw.x1, a.data());
                    ReadSpanFlt(*result, y, dw.x0, dw.x1, r.data());
                    if (mask) ReadSpanFlt(*mask, y, dw.x0, dw.x1, m.data());
                    for (int x = 0; x < w; ++x) a[x] = mix(a[x], r[x], mask ? &m[x] : nullptr);
                    StoreFlt(mixed->Depth(), a.data(), w, mixed->ScanLine(y));
                }
            },
            4);
    }
    req->SetOutputData(out, mixed.Get());
}

} // namespace Orvane
