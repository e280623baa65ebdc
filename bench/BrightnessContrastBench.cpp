// BrightnessContrast on a UHD RGBA float32 frame, called through the engine
// with the result cache off, so that what is timed is what a render pays:
//   Matrix  Gain 1.2, Brightness 0.1: one colour matrix, applied by the host
//   Rows    Gamma 1.3 with fast powers: the four-channel row function
//   Copy    Image::ImageCopy of the same frame into a new image, the floor
//           set by memory bandwidth
#include <benchmark/benchmark.h>

#include <string>
#include <utility>
#include <vector>

#include "host/app/Application.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"

namespace Orvane {
namespace {

constexpr int kWidth = 3840, kHeight = 2160;

/// The frame every case starts from: smooth ramps with some variation, alpha 1.
const Ref<Image> &SourceFrame() {
    static const Ref<Image> frame = [] {
        Ref<Image> img = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthRGBAFlt32}});
        img->AllocScanLineData();
        for (int y = 0; y < kHeight; ++y) {
            float *row = img->Row<float>(y);
            for (int x = 0; x < kWidth; ++x) {
                row[4 * x + 0] = static_cast<float>(x) / kWidth;
                row[4 * x + 1] = static_cast<float>(y) / kHeight;
                row[4 * x + 2] = static_cast<float>((x * 7 + y * 13) % 1024) / 1023.f;
                row[4 * x + 3] = 1.f;
            }
        }
        return img;
    }();
    return frame;
}

/// A tool that hands the source frame on (its windows only in pre-calculation).
class FrameSource : public ThreadedOperator {
public:
    FrameSource(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        const Image *frame = SourceFrame().Get();
        if (!req->IsPreCalc()) {
            req->SetOutputData(output_, const_cast<Image *>(frame));
            return;
        }
        const ImgRectI dw = frame->DataWindow();
        Ref<Image> shape = NewImageTagList({{ImgLikeImage, frame}, {ImgDataWindow, &dw}, {ImgNoData, 1}});
        req->SetOutputData(output_, shape.Get());
    }
    Output *Out() const { return output_; }

private:
    Output *output_;
};

const OvID kFrameSourceClass("BrightnessContrastBenchSource");

Object *MakeFrameSource(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new FrameSource(reg, args, tags);
}

bool Prepare(benchmark::State &state) {
    std::string error;
    if (!GetApp()->LoadOperators(error)) {
        state.SkipWithError(("cannot load the tool library: " + error).c_str());
        return false;
    }
    static const Registry *row = [] {
        TagList tags{{RegConstructor, &MakeFrameSource},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)},
                     {RegName, "Benchmark Frame"},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1},
                     {RegSupportsRoI, 1},
                     {RegSupportsDoD, 1}};
        return Registry::_Init(&ClassRegistry, kFrameSourceClass, tags);
    }();
    SourceFrame(); // made before the timing starts
    return row != nullptr;
}

void ReportPixels(benchmark::State &state) {
    state.counters["pixels/s"] =
        benchmark::Counter(static_cast<double>(kWidth) * kHeight, benchmark::Counter::kIsIterationInvariantRate);
}

void RunTool(benchmark::State &state, const std::vector<std::pair<const char *, double>> &settings) {
    if (!Prepare(state)) return;
    OrvaneDoc doc;
    auto *source = dynamic_cast<FrameSource *>(doc.AddTool(kFrameSourceClass, "Frame"));
    Operator *bc = doc.AddTool(OvID("BrightnessContrast"));
    if (!source || !bc) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    bc->FindInput("Input")->ConnectTo(source->Out());
    for (const auto &[id, value] : settings) bc->FindInput(id)->SetValue(MakeRef<Number>(value));

    EvalOptions options;
    options.useCache = false;
    for (auto _ : state) {
        Ref<Parameter> out = Evaluate(bc->FindMainOutput(), 0.0, options);
        if (!out || out.Get() == SourceFrame().Get()) {
            state.SkipWithError("the tool gave no new image");
            break;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    ReportPixels(state);
}

void BM_BrightnessContrast_Matrix(benchmark::State &state) { RunTool(state, {{"Gain", 1.2}, {"Brightness", 0.1}}); }

void BM_BrightnessContrast_Rows(benchmark::State &state) {
    const bool fastPower = GetApp()->GetAttrB(AppFastPower), vectorRows = GetApp()->GetAttrB(AppVectorRows);
    GetApp()->SetAttrsTagList({{AppFastPower, 1}, {AppVectorRows, 1}});
    RunTool(state, {{"Gamma", 1.3}});
    GetApp()->SetAttrsTagList({{AppFastPower, fastPower}, {AppVectorRows, vectorRows}});
}

void BM_BrightnessContrast_CopyFloor(benchmark::State &state) {
    if (!Prepare(state)) return;
    const Image *frame = SourceFrame().Get();
    for (auto _ : state) {
        Ref<Image> copy = NewImageTagList({{ImgLikeImage, frame}});
        copy->ImageCopy(frame);
        benchmark::DoNotOptimize(copy.Get());
    }
    ReportPixels(state);
}

BENCHMARK(BM_BrightnessContrast_Matrix)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_BrightnessContrast_Rows)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_BrightnessContrast_CopyFloor)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane
