#include "operators/misc/ChangeDepth.h"

#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "operators/color/PointColor.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_ChangeDepth("ChangeDepth");
static ClassRegistration<ChangeDepth, ThreadedOperator>
    s_Registration(CLSID_ChangeDepth, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Miscellaneous/ChangeDepth"},
                    {RegName, "Change Depth"},
                    {RegCategory, "Miscellaneous"},
                    {RegAbbreviation, "CD"},
                    // The help text is spelt so on purpose: saved documents and scripts hold it.
                    {RegHelp, "Changed the processing color precision"},
                    {RegIcon, "Icons.Tools.Icons.ChangeDepth"},
                    {RegAlias, "dither"},
                    {RegNoBlendControls, 1},
                    {RegNoEffectMask, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

/// n pixels from depth `from` to `to` by the host's conversions: float through
/// FltPixel, integers through 16-bit Pixel.
void HostConvert(int from, int to, const uint8_t *in, uint8_t *out, int n) {
    const size_t inBytes = static_cast<size_t>(FormatOfDepth(from).BytesPerPixel());
    const size_t outBytes = static_cast<size_t>(FormatOfDepth(to).BytesPerPixel());
    FltPixel f[kPointBlock];
    Pixel p[kPointBlock];
    for (int k = 0; k < n; k += kPointBlock) {
        const int m = std::min(kPointBlock, n - k);
        if (FormatOfDepth(from).isFloat) {
            LoadFlt(from, in + k * inBytes, m, f);
            StoreFlt(to, f, m, out + k * outBytes);
        } else {
            LoadPixel(from, in + k * inBytes, m, p);
            StorePixel(to, p, m, out + k * outBytes);
        }
    }
}

} // namespace

ChangeDepth::ChangeDepth(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {});
    depth_ = AddInputTagList("Depth", "Depth",
                             {{LinkDataType, CLSID_DataType_Number},
                              {InputControl, CLSID_InputControl_MultiButton},
                              {InputDefault, 0.0},
                              {InputMinAllowed, 0.0},
                              {InputMaxAllowed, 4.0},
                              {InputInteger, 1},
                              {ButtonsFillRow, 1},
                              {ListAddItem, "Keep"},
                              {ListAddItem, "8-bit"},
                              {ListAddItem, "16-bit"},
                              {ListAddItem, "16-bit Float"},
                              {ListAddItem, "32-bit Float"}});
    dither_ = AddInputTagList("Dither", "Dither",
                              {{LinkDataType, CLSID_DataType_Number},
                               {InputControl, CLSID_InputControl_Checkbox},
                               {InputDefault, 0.0},
                               {InputMinAllowed, 0.0},
                               {InputMaxAllowed, 1.0}});
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void ChangeDepth::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    const int choice = static_cast<int>(std::lround(req->GetInputNumber(depth_)));
    const int from = src ? src->Depth() : 0;
    const int to = choice <= 0 ? from : (src && src->IsMask() ? DepthAInt8 : DepthRGBAInt8) + choice - 1;
    if (!src || to == from) { // nothing to convert
        req->SetOutputData(output_, src);
        return;
    }
    const PixelFormat inFormat = FormatOfDepth(from), outFormat = FormatOfDepth(to);
    const bool dither = req->GetInputNumber(dither_) >= 0.5 && !outFormat.isFloat &&
                        (inFormat.isFloat || inFormat.bytesPerComponent > outFormat.bytesPerComponent);
    const int dithered = outFormat.channels == 1 ? 4 : 3; // channels below this are dithered
    // Values within the input's own rounding of a step stay on it (half floats hold 11 bits).
    const double snap = inFormat.isFloat && inFormat.bytesPerComponent == 2 ? 0x1p-10 : 0x1p-23;

    // Without dither the host's conversions already give the nearest value, except from integers to float, which
    // they scale in float: those take the exact way below.
    const bool hostConverts = !dither && (inFormat.isFloat || !outFormat.isFloat);

    const OvID clipping = GetClippingMode(req);
    const AutoImageRoI roi(req);
    const ImgRectI dataWindow = OutputDataWindow(req, input_, src, clipping);
    const ImgRectI validWindow = roi ? roi->rect : dataWindow;
    Ref<Image> dst = NewImageTagList({{ImgLikeImage, src},
                                      {ImgDepth, to},
                                      {ImgDataWindow, &dataWindow},
                                      {ImgValidWindow, &validWindow},
                                      {ImgNoData, req->IsPreCalc()},
                                      {ImgForRequest, 1},
                                      {ImgTakeWindows, 1}});
    bool ok = dst != nullptr;
    if (ok) dst->CopyCanvasColor(src); // the colour is the same at any depth
    if (ok && !req->IsPreCalc() && !dst->ValidWindow().IsNull()) {
        ok = src->DownloadGPUMem() && dst->AllocScanLineData();
        if (ok) {
            const FltPixel canvas = src->GetCanvasColor();
            const double canvasUnits[1][4] = {{canvas.R, canvas.G, canvas.B, canvas.A}};
            uint8_t canvasPixel[16];
            StoreUnits(to, canvasUnits, 1, canvasPixel, NoDither{});
            const size_t bpp = static_cast<size_t>(outFormat.BytesPerPixel());
            const ImgRectI out = dst->DataWindow();
            const PointRows rows(*src, *dst, canvasPixel);
            DoMultiProcess(
                [&](int i) {
                    const int y = out.y0 + i;
                    rows.Row(i, [&](const uint8_t *a, uint8_t *b, int n) {
                        if (hostConverts) {
                            HostConvert(from, to, a, b, n);
                            return;
                        }
                        WithUnit(to, [&](auto zero) {
                            using T = decltype(zero);
                            T px[kPointBlock][4];
                            const int x0 = out.x0 + static_cast<int>((b - dst->ScanLine(y)) / bpp);
                            for (int k = 0; k < n; k += kPointBlock) {
                                const int m = std::min(kPointBlock, n - k);
                                LoadUnits(from, a + k * static_cast<size_t>(inFormat.BytesPerPixel()), m, px);
                                uint8_t *at = b + k * bpp;
                                if (dither)
                                    StoreUnits(
                                        to, px, m, at,
                                        [&](int j, int c) { return c < dithered ? DitherAt(x0 + k + j, y, c) : -1.0; },
                                        snap);
                                else
                                    StoreUnits(to, px, m, at, NoDither{});
                            }
                        });
                    });
                },
                rows.Count());
        }
    }
    if (!ok) FailOutOfMemory(req);
    req->SetOutputData(output_, ok ? dst.Get() : nullptr);
}

} // namespace Orvane
