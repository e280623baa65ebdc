// The small colour tools on a UHD RGBA float32 frame through the engine, cache off:
//   AlphaMultiply            the shared per-pixel rows (PointColor.h) with the simplest function
//   ChangeDepth to 8 bits    float to integer steps, plain and dithered
//   CustomColorMatrix        a full 4 x 4 matrix with offsets, applied by the host
//   ChannelBoolean           a shuffle with luminance, one image (two reads per pixel)
//   CineonLog                log to linear over the host's row function
// Compare with BM_CopyFloor (CopyBench.cpp), the memory-bandwidth floor.
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"

namespace Orvane::Bench {
namespace {

void RunTool(benchmark::State &state, const char *id, const std::vector<std::pair<const char *, double>> &settings) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Output *source = AddFrameSource(doc);
    Operator *tool = doc.AddTool(OvID(id));
    if (!source || !tool) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    tool->FindMainInput()->ConnectTo(source);
    for (const auto &[input, value] : settings) tool->FindInput(input)->SetValue(MakeRef<Number>(value));
    RenderLoop(state, tool);
}

void BM_AlphaMultiply(benchmark::State &state) { RunTool(state, "AlphaMultiply", {}); }
BENCHMARK(BM_AlphaMultiply)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ChangeDepth_To8Bit(benchmark::State &state) { RunTool(state, "ChangeDepth", {{"Depth", 1}}); }
BENCHMARK(BM_ChangeDepth_To8Bit)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ChangeDepth_To8BitDithered(benchmark::State &state) {
    RunTool(state, "ChangeDepth", {{"Depth", 1}, {"Dither", 1}});
}
BENCHMARK(BM_ChangeDepth_To8BitDithered)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_CustomColorMatrix(benchmark::State &state) {
    RunTool(state, "CustomColorMatrix",
            {{"RedFromGreen", 0.1}, {"BlueFromAlpha", 0.2}, {"AlphaFromRed", 0.1}, {"GreenOffset", 0.05}});
}
BENCHMARK(BM_CustomColorMatrix)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ChannelBoolean_Shuffle(benchmark::State &state) {
    RunTool(state, "ChannelBoolean", {{"ToRed", 2}, {"ToBlue", 0}, {"ToAlpha", 10}});
}
BENCHMARK(BM_ChannelBoolean_Shuffle)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_CineonLog_ToLinear(benchmark::State &state) { RunTool(state, "CineonLog", {}); }
BENCHMARK(BM_CineonLog_ToLinear)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
