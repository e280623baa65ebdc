// ResampleImageOnDevice: the separable resampler's two passes as the
// "ResizeAcross" and "ResizeDown" kernels of the common library. The tables
// travel as one-channel float images (a row per output sample: first source
// index, then the weights); the rows filtered across live in a float image on
// the device between the two runs and are freed after.
#include <cmath>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "host/core/ScriptVal.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/Resample.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/ResizeKernelParams.h"

namespace Orvane {
namespace {

/// The table rows of output samples [begin, end) as a (taps + 1) wide float
/// image: first index, then the weights. False when an index is too large to
/// pass exactly as a float.
bool TableImage(const ResampleAxis &axis, int begin, int end, std::vector<float> &out) {
    const int taps = axis.Taps();
    out.assign(static_cast<size_t>(end - begin) * (taps + 1), 0.f);
    for (int o = begin; o < end; ++o) {
        const int i = o - axis.Start();
        if (std::abs(axis.First(i)) >= (1 << 24)) return false;
        float *row = out.data() + static_cast<size_t>(o - begin) * (taps + 1);
        row[0] = static_cast<float>(axis.First(i));
        std::memcpy(row + 1, axis.Weights(i), sizeof(float) * taps);
    }
    return true;
}

} // namespace

bool ResampleImageOnDevice(Request *req, const Image &src, Image &dst, const ResampleAxis &ax, const ResampleAxis &ay) {
    RenderTask *task = req ? req->GetTask() : nullptr;
    const ImgRectI dw = dst.DataWindow();
    if (!task || !task->Device() || dst.IsNoData() || dw.IsNull() || !ax.Covers(dw.x0, dw.x1) ||
        !ay.Covers(dw.y0, dw.y1))
        return false;
    const char *name = "ResampleImageOnDevice";
    std::vector<float> tx, ty;
    if (!TableImage(ax, dw.x0, dw.x1, tx) || !TableImage(ay, dw.y0, dw.y1, ty)) {
        task->NoteDeviceFailure(name, "source indices beyond the float range");
        return false;
    }
    int rows0 = 0, rows1 = 0;
    ay.SourceSpan(dw.y0, dw.y1, rows0, rows1);

    auto block = std::make_shared<ResizeParams>();
    ResizeParams &p = *block;
    const FltPixel c = src.GetCanvasColor();
    const float canvas[4] = {c.R, c.G, c.B, c.A};
    std::memcpy(p.canvas, canvas, sizeof canvas);
    const bool hasPixels = src.HasScanLineData() || src.IsGPUMemDirty();
    const ImgRectI sw = hasPixels ? src.DataWindow() : ImgRectI();
    const int window[4] = {sw.x0, sw.x1, sw.y0, sw.y1};
    std::memcpy(p.srcWindow, window, sizeof window);
    const ResampleSpec &sx = ax.Spec(), &sy = ay.Spec();
    p.rangeX[0] = sx.srcLo, p.rangeX[1] = sx.srcHi;
    p.rangeY[0] = sy.srcLo, p.rangeY[1] = sy.srcHi;
    p.edges[0] = sx.edges, p.edges[1] = sy.edges;
    p.tapsX = ax.Taps(), p.tapsY = ay.Taps();
    p.rowsY0 = rows0;
    p.acrossSize[0] = dw.Width(), p.acrossSize[1] = rows1 - rows0;
    p.workSize[0] = dw.Width(), p.workSize[1] = dw.Height();

    std::string failure;
    const bool ok = task->Execute(name, [&](IDeviceContext *ctx) {
        auto fail = [&](const std::string &why) {
            failure = why;
            return false;
        };
        auto acrossNode = KROMComputeNode::Create(ctx, "ResizeAcross", nullptr, ResizeParamsText, false);
        auto downNode = KROMComputeNode::Create(ctx, "ResizeDown", nullptr, ResizeParamsText, false);
        if (!acrossNode->IsValid()) return fail(acrossNode->Error());
        if (!downNode->IsValid()) return fail(downNode->Error());
        auto input = KROMBuffer::CreateImage(ctx, &src, KROMBufferRead);
        auto tableX = KROMBuffer::CreateImage(ctx, ax.Taps() + 1, dw.Width(), DepthAFlt32, tx.data());
        auto tableY = KROMBuffer::CreateImage(ctx, ay.Taps() + 1, dw.Height(), DepthAFlt32, ty.data());
        auto across = KROMBuffer::CreateImage(ctx, dw.Width(), rows1 - rows0, DepthRGBAFlt32, nullptr);
        auto output = KROMBuffer::CreateImage(ctx, &dst, KROMBufferWrite);
        for (const auto *b : {input.get(), tableX.get(), tableY.get(), across.get(), output.get()})
            if (!b->IsValid()) return fail(b->Error().empty() ? "a device buffer could not be made" : b->Error());
        p.srcCompOrder = input->GetCompOrder();
        p.dstCompOrder = output->GetCompOrder();
        acrossNode->SetParamStruct(block, sizeof(ResizeParams));
        acrossNode->AddInput("input", input.get());
        acrossNode->AddInput("tableX", tableX.get());
        acrossNode->AddOutput("across", across.get());
        if (!acrossNode->RunSession()) return fail(acrossNode->Error());
        downNode->SetParamStruct(block, sizeof(ResizeParams));
        downNode->AddInput("across", across.get());
        downNode->AddInput("tableY", tableY.get());
        downNode->AddOutput("output", output.get());
        if (!downNode->RunSession()) return fail(downNode->Error());
        dst.SetGPUMem(output->GetGPUMemory(), true);
        return true;
    });
    if (!ok) task->NoteDeviceFailure(name, failure.empty() ? "failed" : failure);
    return ok;
}

} // namespace Orvane
