// Background gradient on a UHD RGBA float32 frame through the engine (no
// cache), beside a plain copy of a frame of the same size: the memory
// bandwidth floor any full-frame generator pays for writing its output.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <string>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Parameter.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"

namespace Orvane {
namespace {

constexpr int kWidth = 3840, kHeight = 2160;

bool OperatorsLoaded() {
    static const bool loaded = [] {
        std::string error;
        if (GetApp()->LoadOperators(error)) return true;
        std::fprintf(stderr, "cannot load the tool library: %s\n", error.c_str());
        return false;
    }();
    return loaded;
}

void SetInput(Operator *op, const char *id, Ref<Parameter> value) {
    if (Input *in = op->FindInput(id)) in->SetValue(std::move(value));
}

void ReportPixels(benchmark::State &state) {
    state.counters["pixels/s"] =
        benchmark::Counter(static_cast<double>(state.iterations()) * kWidth * kHeight, benchmark::Counter::kIsRate);
}

/// Arg: the sub-pixel grid (1 or 3).
void BM_BackgroundLinearGradient(benchmark::State &state) {
    if (!OperatorsLoaded()) {
        state.SkipWithError("no tool library");
        return;
    }
    OrvaneDoc doc;
    Operator *bg = doc.AddTool(OvID("Background"));
    if (!bg) {
        state.SkipWithError("no Background tool");
        return;
    }
    SetInput(bg, "Width", MakeRef<Number>(kWidth));
    SetInput(bg, "Height", MakeRef<Number>(kHeight));
    SetInput(bg, "Depth", MakeRef<Number>(4)); // float32
    SetInput(bg, "Type", MakeRef<IDValue>(OvID("Gradient")));
    SetInput(bg, "GradientType", MakeRef<IDValue>(OvID("Linear")));
    SetInput(bg, "Start", MakeRef<Point>(0.1, 0.2));
    SetInput(bg, "End", MakeRef<Point>(0.9, 0.7));
    const std::string grid = std::to_string(state.range(0)) + "x" + std::to_string(state.range(0));
    SetInput(bg, "SubPixel", MakeRef<IDValue>(OvID(grid)));

    EvalOptions opt;
    opt.useCache = false;
    for (auto _ : state) {
        Ref<Parameter> out = Evaluate(bg->FindMainOutput(), 0.0, opt);
        if (!out) {
            state.SkipWithError("render failed");
            return;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_BackgroundLinearGradient)->Arg(1)->Arg(3)->Unit(benchmark::kMillisecond)->UseRealTime();

/// The floor: copying a same-size RGBA float32 frame into a new image.
void BM_BackgroundCopyFloor(benchmark::State &state) {
    Ref<Image> src = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthRGBAFlt32}});
    src->AllocScanLineData();
    src->Fill({0.25f, 0.5f, 0.75f, 1.0f});
    for (auto _ : state) {
        Ref<Image> dst = NewImageTagList({{ImgLikeImage, src.Get()}});
        dst->ImageCopy(src.Get());
        benchmark::DoNotOptimize(dst->ScanLine(0));
    }
    ReportPixels(state);
}
BENCHMARK(BM_BackgroundCopyFloor)->Unit(benchmark::kMillisecond)->UseRealTime();

} // namespace
} // namespace Orvane
