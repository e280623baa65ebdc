#include "operators/key/LumaKeyer.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <memory>
#include <type_traits>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/KeyKernelParams.h"
#include "operators/frame/Registration.h"
#include "operators/key/KeyFunctions.h"
#include "operators/key/KeyRows.h"

namespace Orvane {

static const OvID CLSID_LumaKeyer("LumaKeyer");
static ClassRegistration<LumaKeyer, ThreadedOperator>
    s_Registration(CLSID_LumaKeyer, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "LumaKeyer"},
                    {RegPath, "Tools/Matte/LumaKeyer"},
                    {RegName, "Luma Keyer"},
                    {RegCategory, "Matte"},
                    {RegAbbreviation, "LKy"},
                    {RegHelp, "Creates a matte from a luminance or color channel"},
                    {RegIcon, "Icons.Tools.Icons.LumaKeyer"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

/// The threshold key of one pixel in float (see KeyFunctions.h).
struct LumaKey {
    int channel;
    float low, high, inverse;
    float operator()(const FltPixel &p, float z) const {
        return KeyThreshold(LumaKeyValue(channel, p.R, p.G, p.B, p.A, z), low, high, inverse);
    }
};

/// The depth key: the Z channel beside the pixels (0 beyond the window or
/// without one), keyed in float at every depth; the canvas once.
template <class Px> void DepthRows(ThreadedOperator &op, const Image &src, Image &dst, const LumaKey &key) {
    auto alphaOf = [&key](float z) {
        const float a = KeyThreshold(z, key.low, key.high, key.inverse);
        if constexpr (std::is_same_v<Px, FltPixel>)
            return a;
        else
            return static_cast<uint16_t>(std::lround(a * 65535.f));
    };
    Px canvas;
    CanvasKeyPixel(src, canvas);
    canvas.A = alphaOf(0.f);
    dst.SetCanvasColor(canvas);
    const ImgRectI dw = src.DataWindow();
    const bool hasZ = src.HasAuxChannel(AuxChannelKind::Z);
    RunKeyRows<Px>(op, src, dst, [&](const Px *in, Px *out, int x, int y, int n) {
        if (!in) {
            std::fill(out, out + n, canvas);
            return;
        }
        const float *z = hasZ ? src.AuxRow(AuxChannelKind::Z, y) + (x - dw.x0) : nullptr;
        for (int i = 0; i < n; ++i) {
            out[i] = in[i];
            out[i].A = alphaOf(z ? z[i] : 0.f);
        }
    });
}

} // namespace

LumaKeyer::LumaKeyer(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : SimpleKeyer(reg, args, tags, KeyerMatte::Flavour::Simple) {
    AddControlPageTagList("Controls", {});
    channelIn_ = AddInputTagList("Channel", "Channel",
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_Combo},
                                  {InputInteger, 1},
                                  {InputDefault, 4.0},
                                  {InputMinAllowed, 0.0},
                                  {InputMaxAllowed, 7.0},
                                  {ListAddItem, "Blue"},
                                  {ListAddItem, "Green"},
                                  {ListAddItem, "Red"},
                                  {ListAddItem, "Alpha"},
                                  {ListAddItem, "Luminance"},
                                  {ListAddItem, "Saturation"},
                                  {ListAddItem, "Hue"},
                                  {ListAddItem, "Depth"}});
    highIn_ = AddInputTagList("High", "High", RangeTags(1, 1, 1.0));
    lowIn_ = AddInputTagList("Low", "Low", RangeTags(1, 0, 0.0));
    matte_.AddMatteInputs();
    input_ = AddImageInput("Input", "Input", 1, true);
    output_ = AddImageOutput();
}

bool LumaKeyer::ReadKey(Request *req, KeyerMatte::Values &) {
    channel_ = std::clamp(static_cast<int>(std::lround(req->GetInputNumber(channelIn_, 4.0))), 0, 7);
    low_ = req->GetInputNumber(lowIn_, 0.0);
    high_ = req->GetInputNumber(highIn_, 1.0);
    return true;
}

bool LumaKeyer::RunDevice(Request *req, const Image *src, Image *dst) const {
    auto block = std::make_shared<LumaKeyParams>();
    LumaKeyParams &p = *block;
    std::memset(&p, 0, sizeof p);
    const float low = static_cast<float>(low_), high = static_cast<float>(high_);
    const LumaKey key{channel_, low, high, high > low ? 1.f / (high - low) : 0.f};
    const FltPixel canvas = src->GetCanvasColor();
    const float defaultP[4] = {canvas.R, canvas.G, canvas.B, key(canvas, 0.f)};
    std::memcpy(p.p, defaultP, sizeof defaultP);
    dst->SetCanvasColor(FltPixel{defaultP[0], defaultP[1], defaultP[2], defaultP[3]});
    p.low = key.low, p.high = key.high, p.diff = key.inverse, p.channelID = channel_;
    const KeyKernelWindows w(*src, *dst);
    std::memcpy(p.srcWindow, w.inDataWindow, sizeof p.srcWindow);
    p.dstLeft = w.outDataWindow[0], p.dstBottom = w.outDataWindow[2];
    std::memcpy(p.workSize, w.workSize, sizeof p.workSize);
    return KROMComputeNode::ExecKernelI(req, "LumaKey", nullptr, LumaKeyParamsText, sizeof p,
                                        offsetof(LumaKeyParams, srcCompOrder), offsetof(LumaKeyParams, dstCompOrder),
                                        block, {{"input", const_cast<Image *>(src)}, {"output", dst}});
}

bool LumaKeyer::RunRows(const Image *src, Image *dst) {
    const float low = static_cast<float>(low_), high = static_cast<float>(high_);
    const LumaKey key{channel_, low, high, high > low ? 1.f / (high - low) : 0.f};
    if (channel_ != LumaDepth) {
        const int channel = channel_;
        const int64_t lo16 = KeySteps16(low_), hi16 = KeySteps16(high_);
        RunPointKeyRows(
            *this, *src, *dst,
            [&key](const FltPixel *in, FltPixel *out, int n) {
                for (int i = 0; i < n; ++i) {
                    const FltPixel p = in[i];
                    out[i] = {p.R, p.G, p.B, key(p, 0.f)};
                }
            },
            [&](const Pixel *in, Pixel *out, int n) {
                for (int i = 0; i < n; ++i) {
                    const Pixel p = in[i];
                    out[i] = {p.R, p.G, p.B, KeyThreshold16(LumaKeyValue16(channel, p.R, p.G, p.B, p.A), lo16, hi16)};
                }
            });
        return true;
    }
    if (src->IsFloat())
        DepthRows<FltPixel>(*this, *src, *dst, key);
    else
        DepthRows<Pixel>(*this, *src, *dst, key);
    return true;
}

bool LumaKeyer::DoLumaKeyKROM(Request *req, const Image *src, Image *dst) {
    if (channel_ != LumaDepth && IsGPUEnabled(req, true) && RunDevice(req, src, dst)) return true;
    if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return false;
    return RunRows(src, dst);
}

} // namespace Orvane
