#include "operators/key/ChromaKey.h"

#include <cstring>
#include <memory>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/KeyKernelParams.h"
#include "operators/frame/Registration.h"
#include "operators/key/KeyRows.h"
#include "operators/warp/SizingCommon.h"

namespace Orvane {

static const OvID CLSID_ChromaKeyer("ChromaKeyer");
static constexpr const char *kRangeIds[8] = {"RedLow",  "GreenLow",  "BlueLow",  "LuminanceLow",
                                             "RedHigh", "GreenHigh", "BlueHigh", "LuminanceHigh"};
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
    : SimpleKeyer(reg, args, tags, KeyerMatte::Flavour::Screen),
      picker_(*this, "LockColorPicking", kRangeIds, "ChromaKeyer Pick") {
    AddControlPageTagList("Chroma", {});
    keyType_ = AddInputTagList("Key Type", "KeyType",
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_MultiButton},
                                {InputDefault, 0.0},
                                {ButtonsFillRow, 1},
                                {ListAddItem, "Chroma"},
                                {ListAddItem, "Color"}});
    BeginControlNestTagList("Color Range", "ColorRangeNest", true, {});
    rangeInputs_.Add(*this, kRangeIds, 1);
    EndControlNest();
    AddInputTagList("Lock Color Picking", "LockColorPicking",
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
    reset_ = AddButton(this, "Reset Color Ranges", "ResetColorRanges");
    AddControlPageTagList("Image", {});
    matte_.AddImageInputs(true);
    AddControlPageTagList("Matte", {});
    matte_.AddMatteInputs();
    input_ = AddImageInput("Input", "Input", 1, true);
    output_ = AddImageOutput();
}

void ChromaKey::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == reset_ && param) rangeInputs_.Reset();
    SimpleKeyer::NotifyChanged(in, param, time, tags);
}

bool ChromaKey::ControlCommand(int command, const TagList &tags) {
    if (command != CCMD_Select) return SimpleKeyer::ControlCommand(command, tags);
    return picker_.Select(tags);
}

void ChromaKey::Process(Request *req) {
    SimpleKeyer::Process(req); // ReadKey reads the ranges this render keys with
    const auto *src = dynamic_cast<const Image *>(req->GetInputData(input_));
    if (src && !req->IsPreCalc()) picker_.Apply(*src, ranges_.keyType, ranges_.low, ranges_.high);
}

bool ChromaKey::ReadKey(Request *req, KeyerMatte::Values &) {
    ranges_.keyType = req->GetInputNumber(keyType_, 0.0) >= 0.5 ? 1 : 0;
    solid_ = rangeInputs_.Read(req, ranges_.low, ranges_.high);
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
