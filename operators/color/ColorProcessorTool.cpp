#include "operators/color/ColorProcessorTool.h"

#include <algorithm>
#include <cstring>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {
namespace {

static_assert(sizeof(FltPixel) == 4 * sizeof(float), "FltPixel runs are read as RGBA float runs");

/// Pixels widened to float at a time.
constexpr int kBlock = 256;

/// `count` stored pixels of `depth` through the processor.
void TransformSpan(const ColorProcessor &proc, int depth, const uint8_t *src, uint8_t *dst, int count) {
    if (depth == DepthRGBAFlt32) {
        if (src != dst) std::memcpy(dst, src, static_cast<size_t>(count) * sizeof(FltPixel));
        proc.Apply(reinterpret_cast<float *>(dst), count);
        return;
    }
    const size_t bpp = static_cast<size_t>(FormatOfDepth(depth).BytesPerPixel());
    FltPixel block[kBlock];
    for (int i = 0; i < count; i += kBlock) {
        const int n = std::min(kBlock, count - i);
        LoadFlt(depth, src + i * bpp, n, block);
        proc.Apply(&block[0].R, n);
        StoreFlt(depth, block, n, dst + i * bpp);
    }
}

} // namespace

void ColorProcessorTool::AddImageLinks() {
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void ColorProcessorTool::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) { // a required main input: the engine does not get here without one
        req->SetOutputData(output_, nullptr);
        return;
    }
    std::string error;
    bool passThrough = false;
    const ColorProcessorPtr proc = ProcessorFor(req, &passThrough, &error);
    if (passThrough || (proc && (proc->IsNoOp() || src->IsMask()))) {
        req->SetOutputData(output_, src);
        return;
    }
    if (!proc) {
        Fail(req, "%s: %s\n", Name().c_str(), error.c_str());
        req->SetOutputData(output_, nullptr);
        return;
    }

    const OvID clipping = GetClippingMode(req);
    Ref<Image> dst = NewPointOutput(req, input_, src, clipping);
    auto outOfMemory = [&] {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
    };
    if (!dst) return outOfMemory();

    // The canvas colour through the transform, rounded as the rows round it.
    const int depth = src->Depth();
    FltPixel canvas = src->GetCanvasColor();
    proc->Apply(&canvas.R, 1);
    uint8_t canvasPixel[16];
    StoreFlt(depth, &canvas, 1, canvasPixel);
    if (src->IsFloat())
        dst->SetCanvasColor(canvas);
    else
        dst->SetCanvasColor(FltToPixel(canvas));

    if (!req->IsPreCalc() && !dst->ValidWindow().IsNull()) {
        if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return outOfMemory();
        const ColorProcessor &p = *proc;
        const PointRows rows(*src, *dst, canvasPixel);
        DoMultiProcess(
            [&](int i) {
                rows.Row(i, [&](const uint8_t *in, uint8_t *out, int n) { TransformSpan(p, depth, in, out, n); });
            },
            rows.Count());
    }

    // With clipping, what lies beyond the window keeps the input's canvas.
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
