#include "operators/key/DifferenceKey.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <memory>
#include <type_traits>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/KeyKernelParams.h"
#include "operators/frame/Registration.h"
#include "operators/key/KeyFunctions.h"
#include "operators/key/KeyRows.h"

namespace Orvane {

static const OvID CLSID_DifferenceKeyer("DifferenceKeyer");
static ClassRegistration<DifferenceKey, ThreadedOperator>
    s_Registration(CLSID_DifferenceKeyer, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "DifferenceKey"},
                    {RegPath, "Tools/Matte/DifferenceKeyer"},
                    {RegName, "Difference Keyer"},
                    {RegCategory, "Matte"},
                    {RegAbbreviation, "DfK"},
                    {RegHelp, "Creates a matte from Comparing two images"},
                    {RegIcon, "Icons.Tools.Icons.DifferenceKey"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

DifferenceKey::DifferenceKey(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : SimpleKeyer(reg, args, tags, KeyerMatte::Flavour::Simple) {
    AddControlPageTagList("Controls", {});
    lowIn_ = AddInputTagList("Low", "Low", RangeTags(1, 0, 0.0));
    highIn_ = AddInputTagList("High", "High", RangeTags(1, 1, 0.02));
    matte_.AddMatteInputs();
    input_ = AddImageInput("Background", "Background", 1, true);
    foregroundIn_ = AddImageInput("Foreground", "Foreground", 2, false);
    output_ = AddImageOutput();
}

bool DifferenceKey::ReadKey(Request *req, KeyerMatte::Values &) {
    low_ = req->GetInputNumber(lowIn_, 0.0);
    high_ = req->GetInputNumber(highIn_, 0.02);
    foreground_ = dynamic_cast<Image *>(req->GetInputData(foregroundIn_));
    return true;
}

bool DifferenceKey::RunDevice(Request *req, const Image *src, const Image *fg, Image *dst) const {
    auto block = std::make_shared<DifferenceKeyerParams>();
    DifferenceKeyerParams &p = *block;
    std::memset(&p, 0, sizeof p);
    p.lo = static_cast<float>(low_), p.hi = static_cast<float>(high_);
    p.dif = p.hi > p.lo ? 1.f / (p.hi - p.lo) : 0.f;
    const FltPixel canvas = src->GetCanvasColor();
    const float sp[4] = {canvas.R, canvas.G, canvas.B, canvas.A};
    std::memcpy(p.sp, sp, sizeof sp);
    const FltPixel fgCanvas = fg->GetCanvasColor();
    const float fc[3] = {fgCanvas.R, fgCanvas.G, fgCanvas.B}, bc[3] = {canvas.R, canvas.G, canvas.B};
    dst->SetCanvasColor(FltPixel{canvas.R, canvas.G, canvas.B, KeyThreshold(KeyDifference(fc, bc), p.lo, p.hi, p.dif)});
    const KeyKernelWindows w(*src, *dst);
    std::memcpy(p.inDataWindow, w.inDataWindow, sizeof p.inDataWindow);
    std::memcpy(p.outDataWindow, w.outDataWindow, sizeof p.outDataWindow);
    std::memcpy(p.workSize, w.workSize, sizeof p.workSize);
    return KROMComputeNode::ExecKernelI(
        req, "DifferenceKeyer", nullptr, DifferenceKeyerParamsText, sizeof p,
        offsetof(DifferenceKeyerParams, srcCompOrder), offsetof(DifferenceKeyerParams, dstCompOrder), block,
        {{"input", const_cast<Image *>(src)}, {"foreground", const_cast<Image *>(fg)}, {"output", dst}});
}

template <class Px> void DifferenceKey::RunRows(const Image *src, const Image *fg, Image *dst) {
    constexpr bool isFloat = std::is_same_v<Px, FltPixel>;
    Px canvas;
    CanvasKeyPixel(*src, canvas);
    const float low = static_cast<float>(low_), high = static_cast<float>(high_);
    const float inverse = high > low ? 1.f / (high - low) : 0.f;
    const int64_t lo16 = KeySteps16(low_), hi16 = KeySteps16(high_);
    auto key = [&](const Px &b, const Px &f) {
        Px out = b;
        if constexpr (isFloat) {
            const float fc[3] = {f.R, f.G, f.B}, bc[3] = {b.R, b.G, b.B};
            out.A = KeyThreshold(KeyDifference(fc, bc), low, high, inverse);
        } else {
            const uint16_t fc[3] = {f.R, f.G, f.B}, bc[3] = {b.R, b.G, b.B};
            out.A = KeyThreshold16(KeyDifference16(fc, bc), lo16, hi16);
        }
        return out;
    };
    const Px canvasResult = key(canvas, canvas);
    // Beyond every window both images are their canvas colours.
    Px fgCanvas = canvas;
    if (foreground_) CanvasKeyPixel(*foreground_, fgCanvas);
    dst->SetCanvasColor(key(canvas, fgCanvas));
    const ImgRectI out = dst->DataWindow();
    RunKeyRows<Px>(*this, *src, *dst, [&](const Px *in, Px *res, int x, int y, int n) {
        if (!fg) { // the Background against its own canvas colour
            for (int i = 0; i < n; ++i) res[i] = in ? key(in[i], canvas) : canvasResult;
            return;
        }
        Px f[kKeyBlock];
        LoadKeyPixels(fg->Depth(), fg->ScanLine(y) + static_cast<size_t>(x - out.x0) * fg->BytesPerPixel(), n, f);
        for (int i = 0; i < n; ++i) res[i] = key(in ? in[i] : canvas, f[i]);
    });
}

bool DifferenceKey::DoDiffKey(Request *, const Image *src, const Image *fg, Image *dst) {
    if (!dst->AllocScanLineData()) return false;
    RunRows<Pixel>(src, fg, dst);
    return true;
}

bool DifferenceKey::DoDiffKeyFlt(Request *, const Image *src, const Image *fg, Image *dst) {
    if (!dst->AllocScanLineData()) return false;
    RunRows<FltPixel>(src, fg, dst);
    return true;
}

bool DifferenceKey::FirstMatte(Request *req, const Image *src, Image *dst) {
    const Image *fg = foreground_;
    const ImgRectI window = dst->DataWindow();
    // The Foreground is read over the output's window: an image of another
    // window is copied to it once, canvas beyond it, in float32 or 16-bit
    // steps so that its canvas colour keeps its precision.
    const bool aligned = fg && fg->DataWindow() == window && (fg->HasScanLineData() || fg->IsGPUMemDirty());
    if (aligned && fg->Depth() == src->Depth() && IsGPUEnabled(req, true) && RunDevice(req, src, fg, dst)) return true;
    if (!src->DownloadGPUMem() || (fg && !fg->DownloadGPUMem())) return false;
    Ref<Image> copy;
    if (fg && !aligned) {
        const int depth = fg->IsFloat() ? DepthRGBAFlt32 : DepthRGBAInt16;
        copy = NewImageTagList(
            {{ImgLikeImage, fg}, {ImgDepth, depth}, {ImgDataWindow, &window}, {ImgAbortFlag, dst->AbortFlag()}});
        if (!copy || !copy->AllocScanLineData()) return false;
        copy->ImageCopy(fg);
        fg = copy.Get();
    }
    // 16-bit steps when both images are integer, else float.
    const bool integer = !src->IsFloat() && !(fg && fg->IsFloat());
    return integer ? DoDiffKey(req, src, fg, dst) : DoDiffKeyFlt(req, src, fg, dst);
}

} // namespace Orvane
