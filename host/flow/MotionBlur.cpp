#include "host/flow/MotionBlur.h"

#include <algorithm>
#include <cmath>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"

namespace Orvane {

std::vector<double> MotionBlurSampleTimes(double time, const MotionBlurSettings &s) {
    const int n = std::max(s.quality, 1);
    const double open = s.shutterAngle / 360.0;
    if (n == 1 || !(open > 0.0)) return {time};
    std::vector<double> times(n);
    for (int i = 0; i < n; ++i) {
        const double u = ((i + 0.5) / n - 0.5) * s.sampleSpread;
        times[i] = time + open * (s.centerBias / 2.0 + u);
    }
    return times;
}

namespace {

/// The number an input gives at `time`: its constant or curve, or the value
/// of the tool it is linked to; `fallback` when there is none.
double NumberAt(const Input *in, double time, const EvalOptions &options, double fallback) {
    if (!in) return fallback;
    Ref<Parameter> value;
    if (in->Link()) {
        EvalOptions o = options;
        o.roi.reset();
        value = EvaluateOnDevice(in->Link(), time, o);
    } else {
        value = in->ValueAt(time);
    }
    const auto *n = dynamic_cast<const Number *>(value.Get());
    return n ? n->value : fallback;
}

FltPixel Mean(const FltPixel &sum, float n) { return {sum.R / n, sum.G / n, sum.B / n, sum.A / n}; }

void Add(FltPixel &sum, const FltPixel &p) { sum.R += p.R, sum.G += p.G, sum.B += p.B, sum.A += p.A; }

/// One sample, as pixels in main memory; null (with a console line where
/// the sample did not write one) when it failed.
Ref<Image> Sample(Output *out, double time, const EvalOptions &sub) {
    Ref<Parameter> value = EvaluateOnDevice(out, time, sub); // a pending transform comes back as pixels
    if (!value) return nullptr;
    Ref<Image> img(dynamic_cast<Image *>(value.Get()));
    Operator *op = out->Owner();
    if (!img) {
        if (op->GetDoc())
            op->GetDoc()->PrintF(ConsoleError, "%s: motion blur needs an image, and the output at time %g is none\n",
                                 op->Name().c_str(), time);
        return nullptr;
    }
    if (!img->DownloadGPUMem()) {
        if (op->GetDoc())
            op->GetDoc()->PrintF(ConsoleError, "%s: an image could not be brought back from the device (time = %f)\n",
                                 op->Name().c_str(), time);
        return nullptr;
    }
    return img;
}

/// Pre-calculation: the windows of every sample joined, canvases averaged.
Ref<Parameter> BlurredShape(Output *out, const std::vector<double> &times, const EvalOptions &sub) {
    Ref<Image> first;
    ImgRectI dw;
    FltPixel canvas{};
    for (double t : times) {
        Ref<Image> shape = Sample(out, t, sub);
        if (!shape) return nullptr;
        if (!first) {
            first = shape;
            dw = shape->DataWindow();
        } else {
            dw |= shape->DataWindow();
        }
        Add(canvas, shape->GetCanvasColor());
    }
    canvas = Mean(canvas, static_cast<float>(times.size()));
    Ref<Image> result =
        NewImageTagList({{ImgLikeImage, first.Get()}, {ImgDataWindow, &dw}, {ImgNoData, 1}, {ImgCanvasColor, &canvas}});
    if (result) result->SetScale(first->XScale(), first->YScale());
    return result;
}

} // namespace

std::optional<Ref<Parameter>> MotionBlurOf(Output *out, double time, const EvalOptions &options) {
    if (!out || (options.flags & ReqFlagMotionSample) || !IsImageDataType(out->DataType())) return std::nullopt;
    Operator *op = out->Owner();
    const Operator::CommonInputs &common = op->Common();
    if (!common.motionBlur || NumberAt(common.motionBlur, time, options, 0.0) < 0.5) return std::nullopt;
    MotionBlurSettings s;
    s.quality = static_cast<int>(std::floor(NumberAt(common.motionQuality, time, options, s.quality) + 0.5));
    s.shutterAngle = NumberAt(common.shutterAngle, time, options, s.shutterAngle);
    s.centerBias = NumberAt(common.centerBias, time, options, s.centerBias);
    s.sampleSpread = NumberAt(common.sampleSpread, time, options, s.sampleSpread);
    std::vector<double> times = MotionBlurSampleTimes(time, s);
    // Every sample at one time (no spread): one render at that time.
    if (std::all_of(times.begin(), times.end(), [&](double t) { return t == times.front(); })) times.resize(1);
    if (times.size() == 1 && times.front() == time) return std::nullopt;

    RenderTask *task = options.task;
    auto aborted = [task] { return task && task->IsAborted(); };
    EvalOptions sub = options;
    sub.flags |= ReqFlagMotionSample;
    if (options.flags & ReqFlagPreCalc) return BlurredShape(out, times, sub);

    // The output's windows and depth: the blurred pre-calculation.
    EvalOptions pre = options;
    pre.flags |= ReqFlagPreCalc;
    pre.roi.reset();
    Ref<Parameter> shapeValue = EvaluateOnDevice(out, time, pre);
    auto *shape = dynamic_cast<Image *>(shapeValue.Get());
    if (!shape) return Ref<Parameter>();
    ImgRectI dw = shape->DataWindow();
    if (options.roi) dw &= options.roi->rect;

    Ref<Image> result =
        NewImageTagList({{ImgLikeImage, shape},
                         {ImgDataWindow, &dw},
                         {ImgValidWindow, &dw},
                         {ImgAbortFlag, task ? static_cast<const void *>(task->AbortFlag()) : nullptr}});
    if (!result || !result->AllocScanLineData()) {
        if (op->GetDoc())
            op->GetDoc()->PrintF(ConsoleError, "%s: out of memory (time = %f)\n", op->Name().c_str(), time);
        return Ref<Parameter>();
    }
    result->SetScale(shape->XScale(), shape->YScale());

    // Sums in float RGBA: in the output's own rows when they are float RGBA,
    // else in a buffer of their size.
    const int w = dw.Width(), h = dw.Height();
    const bool inPlace = result->Depth() == DepthRGBAFlt32;
    std::vector<FltPixel> buffer(inPlace ? 0 : static_cast<size_t>(w) * static_cast<size_t>(h));
    auto sumRow = [&](int y) {
        return inPlace ? result->Row<FltPixel>(y) : buffer.data() + static_cast<size_t>(y - dw.y0) * w;
    };

    FltPixel canvas{};
    for (double t : times) {
        Ref<Image> sample = Sample(out, t, sub);
        if (!sample || aborted()) return Ref<Parameter>();
        Add(canvas, sample->GetCanvasColor());
        ParallelRange(
            dw.y0, dw.y1,
            [&](int y0, int y1) {
                std::vector<FltPixel> px(w);
                for (int y = y0; y < y1; ++y) {
                    if (aborted()) return;
                    ReadSpanFlt(*sample, y, dw.x0, dw.x1, px.data());
                    FltPixel *sum = sumRow(y);
                    for (int x = 0; x < w; ++x) Add(sum[x], px[x]);
                }
            },
            4);
    }
    if (aborted()) return Ref<Parameter>();

    const float n = static_cast<float>(times.size());
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            for (int y = y0; y < y1; ++y) {
                FltPixel *sum = sumRow(y);
                for (int x = 0; x < w; ++x) sum[x] = Mean(sum[x], n);
                if (!inPlace) StoreFlt(result->Depth(), sum, w, result->ScanLine(y));
            }
        },
        4);
    result->SetCanvasColor(Mean(canvas, n));
    return Ref<Parameter>(result);
}

} // namespace Orvane
