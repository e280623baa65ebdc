#include "operators/key/ChromaKey.h"

#include <cstring>
#include <memory>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/KeyKernelParams.h"
#include "operators/frame/Registration.h"
#include "operators/key/KeyRows.h"

namespace Orvane {

static const OvID CLSID_ChromaKeyer("ChromaKeyer");
static ClassRegistration<ChromaKey, ThreadedOperator>
    s_Registration(CLSID_ChromaKeyer, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "ChromaKey"},
                    {RegPath, "Tools/Matte/ChromaKeyer"},
                    {RegName, "Chroma Keyer"},
                    {RegCategory, "Matte"},
                    {RegAbbreviation, "CKy"},
                    {RegHelp, "Creates a matte from a uniform colored background"},
                    {RegIcon, "Icons.Tools.Icons.ChromaKey"},
                    {RegNoMotionBlurControls, 1},
                    {RegHasOperatorControl, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

ChromaKey::ChromaKey(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : SimpleKeyer(reg, args, tags, KeyerMatte::Flavour::Screen) {
    AddControlPageTagList("Chroma", {});
    keyType_ = AddInputTagList("Key Type", "KeyType",
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_MultiButton},
                                {InputDefault, 0.0},
                                {ButtonsFillRow, 1},
                                {ListAddItem, "Chroma"},
                                {ListAddItem, "Color"}});
    BeginControlNestTagList("Color Range", "ColorRangeNest", true, {});
    static const char *const axes[4] = {"Red", "Green", "Blue", "Luminance"};
    for (int i = 0; i < 4; ++i) {
        const std::string axis = axes[i];
        TagList low = RangeTags(i + 1, 0, 0.0);
        low.Set({ControlRowLabel, axes[i]});
        low_[i] = AddInputTagList((axis + " Low").c_str(), (axis + "Low").c_str(), low);
        high_[i] = AddInputTagList((axis + " High").c_str(), (axis + "High").c_str(), RangeTags(i + 1, 1, 1.0));
    }
    EndControlNest();
    lock_ = AddInputTagList("Lock Color Picking", "LockColorPicking",
                            {{LinkDataType, CLSID_DataType_Number},
                             {InputControl, CLSID_InputControl_Checkbox},
                             {InputDefault, 0.0},
                             {InputPassive, 1}});
    soft_ = AddInputTagList("Soft Range", "SoftRange",
                            {{LinkDataType, CLSID_DataType_Number},
                             {InputControl, CLSID_InputControl_Slider},
                             {InputDefault, 0.0},
                             {InputMinAllowed, 0.0},
                             {InputMaxAllowed, 1.0},
                             {InputSliderLow, 0.0},
                             {InputSliderHigh, 0.2}});
    reset_ = AddInputTagList("Reset Color Ranges", "ResetColorRanges",
                             {{LinkDataType, CLSID_DataType_Number},
                              {InputControl, CLSID_InputControl_Button},
                              {InputExternal, 0},
                              {InputPassive, 1},
                              {InputNotify, 1},
                              {InputInitialNotify, 0},
                              {LinkNotSaved, 1}});
    AddControlPageTagList("Image", {});
    matte_.AddImageInputs(true);
    AddControlPageTagList("Matte", {});
    matte_.AddMatteInputs();
    input_ = AddImageInput("Input", "Input", 1, true);
    output_ = AddImageOutput();
}

void ChromaKey::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == reset_ && param)
        for (int i = 0; i < 4; ++i) low_[i]->ResetValue(), high_[i]->ResetValue();
    SimpleKeyer::NotifyChanged(in, param, time, tags);
}

bool ChromaKey::ReadKey(Request *req, KeyerMatte::Values &) {
    ranges_.keyType = req->GetInputNumber(keyType_, 0.0) >= 0.5 ? 1 : 0;
    solid_ = true;
    for (int i = 0; i < 4; ++i) {
        ranges_.low[i] = static_cast<float>(req->GetInputNumber(low_[i], 0.0));
        ranges_.high[i] = static_cast<float>(req->GetInputNumber(high_[i], 1.0));
        solid_ = solid_ && ranges_.low[i] == 0.f && ranges_.high[i] == 1.f;
    }
    ranges_.soft = static_cast<float>(req->GetInputNumber(soft_, 0.0));
    return true;
}

bool ChromaKey::FirstMatte(Request *req, const Image *src, Image *dst) {
    return solid_ ? DoSolidAlpha(req, src, dst) : DoChromaKey(req, src, dst);
}

bool ChromaKey::RunDevice(Request *req, const Image *src, Image *dst) const {
    auto block = std::make_shared<ChromaKeyerParams>();
    ChromaKeyerParams &p = *block;
    std::memset(&p, 0, sizeof p);
    const FltPixel canvas = src->GetCanvasColor();
    const float defaultP[4] = {canvas.R, canvas.G, canvas.B, ChromaKeyAlpha(ranges_, canvas.R, canvas.G, canvas.B)};
    std::memcpy(p.defaultP, defaultP, sizeof defaultP);
    dst->SetCanvasColor(FltPixel{defaultP[0], defaultP[1], defaultP[2], defaultP[3]});
    std::memcpy(p.lowRGBL, ranges_.low, sizeof p.lowRGBL);
    std::memcpy(p.highRGBL, ranges_.high, sizeof p.highRGBL);
    p.soft = ranges_.soft;
    p.key = ranges_.keyType;
    const KeyKernelWindows w(*src, *dst);
    std::memcpy(p.srcWindow, w.inDataWindow, sizeof p.srcWindow);
    std::memcpy(p.dstWindow, w.outDataWindow, sizeof p.dstWindow);
    std::memcpy(p.workSize, w.workSize, sizeof p.workSize);
    return KROMComputeNode::ExecKernelI(
        req, "ChromaKeyer", nullptr, ChromaKeyerParamsText, sizeof p, offsetof(ChromaKeyerParams, srcCompOrder),
        offsetof(ChromaKeyerParams, dstCompOrder), block, {{"input", const_cast<Image *>(src)}, {"output", dst}});
}

bool ChromaKey::DoChromaKey(Request *req, const Image *src, Image *dst) {
    if (IsGPUEnabled(req, true) && RunDevice(req, src, dst)) return true;
    if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return false;
    const ChromaKeyRanges &k = ranges_;
    const ChromaKeyRanges16 k16(k);
    RunPointKeyRows(
        *this, *src, *dst,
        [&k](const FltPixel *in, FltPixel *out, int n) {
            for (int i = 0; i < n; ++i) {
                const FltPixel p = in[i];
                out[i] = {p.R, p.G, p.B, ChromaKeyAlpha(k, p.R, p.G, p.B)};
            }
        },
        [&k16](const Pixel *in, Pixel *out, int n) {
            for (int i = 0; i < n; ++i) {
                const Pixel p = in[i];
                out[i] = {p.R, p.G, p.B, ChromaKeyAlpha16(k16, p.R, p.G, p.B)};
            }
        });
    return true;
}

bool ChromaKey::DoSolidAlpha(Request *, const Image *src, Image *dst) {
    if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return false;
    RunPointKeyRows(
        *this, *src, *dst,
        [](const FltPixel *in, FltPixel *out, int n) {
            for (int i = 0; i < n; ++i) out[i] = {in[i].R, in[i].G, in[i].B, 1.f};
        },
        [](const Pixel *in, Pixel *out, int n) {
            for (int i = 0; i < n; ++i) out[i] = {in[i].R, in[i].G, in[i].B, 65535};
        });
    return true;
}

} // namespace Orvane
