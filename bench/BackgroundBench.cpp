// Background gradient on a UHD RGBA float32 frame through the engine, cache
// off, with 1x1 and 3x3 sub-pixel grids. Compare with BM_CopyFloor
// (CopyBench.cpp): writing the output is the floor any full-frame generator pays.
#include <string>

#include "bench/BenchSupport.h"

namespace Orvane::Bench {
namespace {

void SetInput(Operator *op, const char *id, Ref<Parameter> value) {
    if (Input *in = op->FindInput(id)) in->SetValue(std::move(value));
}

/// Arg: the sub-pixel grid (1 or 3).
void BM_BackgroundLinearGradient(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
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
    RenderLoop(state, bg);
}
BENCHMARK(BM_BackgroundLinearGradient)->Arg(1)->Arg(3)->Unit(benchmark::kMillisecond)->UseRealTime();

} // namespace
} // namespace Orvane::Bench
