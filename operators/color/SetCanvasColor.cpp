#include "operators/color/SetCanvasColor.h"

#include <cstring>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/image/PixelConvert.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_SetCanvasColor("SetCanvasColor");
static ClassRegistration<SetCanvasColor, ThreadedOperator>
    s_Registration(CLSID_SetCanvasColor, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Matte/SetCanvasColor"},
                    {RegName, "Set Canvas Color"},
                    {RegCategory, "Matte"},
                    {RegAbbreviation, "SCv"},
                    {RegHelp, "Sets the color outside the data window of an image"},
                    {RegIcon, "Icons.Tools.Icons.SetCanvasColor"},
                    {RegOldClassId, "SetBgColor"},
                    {RegNoBlendControls, 1},
                    {RegNoEffectMask, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

SetCanvasColor::SetCanvasColor(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {});
    const char *const names[4] = {"Red", "Green", "Blue", "Alpha"};
    const int channels[4] = {ColorChannelRed, ColorChannelGreen, ColorChannelBlue, ColorChannelAlpha};
    for (int c = 0; c < 4; ++c) {
        const std::string name = std::string("Canvas ") + names[c];
        TagList t{{LinkDataType, CLSID_DataType_Number},
                  {InputControl, CLSID_InputControl_Color},
                  {ControlGroup, 1},
                  {ControlMember, c},
                  {ColorChannel, channels[c]},
                  {InputSliderLow, 0.0},
                  {InputSliderHigh, 1.0},
                  {InputDefault, 0.0}};
        if (c == 0) t.Add({ControlLabel, "Canvas Color"});
        color_[c] = AddInputTagList(name.c_str(), (std::string("Canvas") + names[c]).c_str(), t);
    }
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void SetCanvasColor::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const FltPixel color{
        static_cast<float>(req->GetInputNumber(color_[0])), static_cast<float>(req->GetInputNumber(color_[1])),
        static_cast<float>(req->GetInputNumber(color_[2])), static_cast<float>(req->GetInputNumber(color_[3]))};
    const OvID clipping = GetClippingMode(req);
    if (color == src->GetCanvasColor() && clipping == ClippingMode_None) { // nothing changes
        req->SetOutputData(output_, src);
        return;
    }
    Ref<Image> dst = NewPointOutput(req, input_, src, clipping);
    bool ok = dst != nullptr;
    if (ok) dst->SetCanvasColor(color);
    if (ok && !req->IsPreCalc() && !dst->ValidWindow().IsNull()) {
        ok = src->DownloadGPUMem() && dst->AllocScanLineData();
        if (ok) {
            uint8_t canvasPixel[16];
            StoreFlt(dst->Depth(), &color, 1, canvasPixel);
            const size_t bpp = static_cast<size_t>(dst->BytesPerPixel());
            const PointRows rows(*src, *dst, canvasPixel);
            DoMultiProcess(
                [&](int i) {
                    rows.Row(i, [bpp](const uint8_t *in, uint8_t *out, int n) { std::memcpy(out, in, n * bpp); });
                },
                rows.Count());
        }
    }
    if (!ok) FailOutOfMemory(req);
    req->SetOutputData(output_, ok ? dst.Get() : nullptr);
}

} // namespace Orvane
