// The Ultra Keyer on a UHD RGBA float32 frame through the engine, cache off:
//   SoftMatte       the soft matte alone (spill off): one per-pixel step
//   TypicalChain    a green screen setting: pre-matte ranges with a pre-matte
//                   blur, separation, matte blur 2, Medium spill and the
//                   background subtracted (soft matte, pre-matte, two blurs,
//                   levels, combine, subtract and spill)
// Compare with BM_CopyFloor (CopyBench.cpp), the memory-bandwidth floor.
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"

namespace Orvane::Bench {
namespace {

const std::vector<std::pair<const char *, double>> kGreenScreen = {
    {"BackgroundRed", 0.15}, {"BackgroundGreen", 0.75}, {"BackgroundBlue", 0.2}};

void RunKeyer(benchmark::State &state, std::vector<std::pair<const char *, double>> settings) {
    if (!LoadLibrary(state)) return;
    settings.insert(settings.begin(), kGreenScreen.begin(), kGreenScreen.end());
    OrvaneDoc doc;
    if (Operator *tool = AddToolOnFrame(state, doc, "UltraKeyer", settings)) RenderLoop(state, tool);
}

void BM_UltraKeyer_SoftMatte(benchmark::State &state) { RunKeyer(state, {{"SpillSuppression", 0}}); }
BENCHMARK(BM_UltraKeyer_SoftMatte)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_UltraKeyer_TypicalChain(benchmark::State &state) {
    RunKeyer(state, {{"RedLow", 0.2},
                     {"RedHigh", 0.45},
                     {"GreenLow", 0.5},
                     {"GreenHigh", 0.8},
                     {"PreMatteSize", 2},
                     {"MatteSeparation", 0.25},
                     {"MatteBlur", 2},
                     {"SpillSuppression", 1},
                     {"SpillMethod", 2}});
}
BENCHMARK(BM_UltraKeyer_TypicalChain)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
