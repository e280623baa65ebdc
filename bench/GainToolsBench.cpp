// The gain tools on a UHD RGBA float32 frame through the engine, cache off:
//   ColorGain_Matrix   gain, lift and saturation: one colour matrix, applied by the host
//   ColorGain_Rows     gamma per channel: the rows with true powers
//   ColorGain_Ranges   the same with a midtones gamma and a shadows lift: two steps per pixel and the weights
//   AutoGain           the measurement of the frame (rows in parallel), then one matrix
// Compare with BM_CopyFloor (CopyBench.cpp), the memory-bandwidth floor.
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"

namespace Orvane::Bench {
namespace {

void RunTool(benchmark::State &state, const char *cls, const std::vector<std::pair<const char *, double>> &settings) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Output *source = AddFrameSource(doc);
    Operator *tool = doc.AddTool(OvID(cls));
    if (!source || !tool) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    tool->FindInput("Input")->ConnectTo(source);
    for (const auto &[id, value] : settings) tool->FindInput(id)->SetValue(MakeRef<Number>(value));
    RenderLoop(state, tool);
}

void BM_ColorGain_Matrix(benchmark::State &state) {
    RunTool(state, "ColorGain", {{"Gain", 1.2}, {"BlueLift", 0.05}, {"Saturation", 0.8}});
}
BENCHMARK(BM_ColorGain_Matrix)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ColorGain_Rows(benchmark::State &state) {
    RunTool(state, "ColorGain", {{"Gain", 1.2}, {"RedGamma", 1.3}, {"Gamma", 0.9}});
}
BENCHMARK(BM_ColorGain_Rows)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ColorGain_Ranges(benchmark::State &state) {
    RunTool(state, "ColorGain", {{"RedGamma", 1.3}, {"MidtonesGamma", 1.2}, {"ShadowsLift", 0.02}});
}
BENCHMARK(BM_ColorGain_Ranges)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_AutoGain(benchmark::State &state) { RunTool(state, "AutoGain", {{"Low", 0.05}, {"High", 0.95}}); }
BENCHMARK(BM_AutoGain)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
