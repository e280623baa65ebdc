// BrightnessContrast on a UHD RGBA float32 frame through the engine, cache off:
//   Matrix  Gain 1.2, Brightness 0.1: one colour matrix, applied by the host
//   Rows    Gamma 1.3 with fast powers: the four-channel row function
// Compare with BM_CopyFloor (CopyBench.cpp), the memory-bandwidth floor.
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"
#include "host/app/Application.h"
#include "host/core/Tags.h"

namespace Orvane::Bench {
namespace {

void RunTool(benchmark::State &state, const std::vector<std::pair<const char *, double>> &settings) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    if (Operator *tool = AddToolOnFrame(state, doc, "BrightnessContrast", settings)) RenderLoop(state, tool);
}

void BM_BrightnessContrast_Matrix(benchmark::State &state) { RunTool(state, {{"Gain", 1.2}, {"Brightness", 0.1}}); }
BENCHMARK(BM_BrightnessContrast_Matrix)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_BrightnessContrast_Rows(benchmark::State &state) {
    const bool fastPower = GetApp()->GetAttrB(AppFastPower), vectorRows = GetApp()->GetAttrB(AppVectorRows);
    GetApp()->SetAttrsTagList({{AppFastPower, 1}, {AppVectorRows, 1}});
    RunTool(state, {{"Gamma", 1.3}});
    GetApp()->SetAttrsTagList({{AppFastPower, fastPower}, {AppVectorRows, vectorRows}});
}
BENCHMARK(BM_BrightnessContrast_Rows)->UseRealTime()->Unit(benchmark::kMillisecond);

/// The same rows with gamma read from the table (a host without fast powers).
void BM_BrightnessContrast_RowsGammaTable(benchmark::State &state) {
    const bool fastPower = GetApp()->GetAttrB(AppFastPower);
    GetApp()->SetAttrsTagList({{AppFastPower, 0}});
    RunTool(state, {{"Gamma", 1.3}});
    GetApp()->SetAttrsTagList({{AppFastPower, fastPower}});
}
BENCHMARK(BM_BrightnessContrast_RowsGammaTable)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
