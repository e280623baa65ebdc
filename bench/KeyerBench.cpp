// The simple keyers on a UHD RGBA float32 frame through the engine, cache off:
//   ChromaKeyer           the range box with a soft edge, spill off: the first matte alone
//   ChromaKeyer + chain   the same with spill, a Gaussian matte blur of 2 and levels
//   LumaKeyer             luminance and hue ramps: the first matte alone
//   DifferenceKeyer       the frame against its own canvas (no Foreground)
// Compare with BM_AlphaMultiply (SmallColorToolsBench.cpp), the simplest per-pixel tool.
#include "bench/BenchSupport.h"

namespace Orvane::Bench {
namespace {

void RunKeyer(benchmark::State &state, const char *id, const std::vector<std::pair<const char *, double>> &numbers) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    if (Operator *tool = AddToolOnFrame(state, doc, id, numbers)) RenderLoop(state, tool);
}

void BM_ChromaKeyer(benchmark::State &state) {
    RunKeyer(state, "ChromaKeyer",
             {{"GreenLow", 0.55}, {"RedHigh", 0.5}, {"BlueHigh", 0.5}, {"SoftRange", 0.05}, {"SpillSuppression", 0}});
}
BENCHMARK(BM_ChromaKeyer)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ChromaKeyer_SpillBlurLevels(benchmark::State &state) {
    RunKeyer(state, "ChromaKeyer",
             {{"GreenLow", 0.55},
              {"RedHigh", 0.5},
              {"BlueHigh", 0.5},
              {"SoftRange", 0.05},
              {"SpillSuppression", 1},
              {"MatteBlur", 2},
              {"MatteGamma", 1.5}});
}
BENCHMARK(BM_ChromaKeyer_SpillBlurLevels)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_LumaKeyer_Luminance(benchmark::State &state) {
    RunKeyer(state, "LumaKeyer", {{"Channel", 4}, {"Low", 0.2}, {"High", 0.8}});
}
BENCHMARK(BM_LumaKeyer_Luminance)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_LumaKeyer_Hue(benchmark::State &state) {
    RunKeyer(state, "LumaKeyer", {{"Channel", 6}, {"Low", 0.2}, {"High", 0.4}});
}
BENCHMARK(BM_LumaKeyer_Hue)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_DifferenceKeyer_AgainstCanvas(benchmark::State &state) {
    RunKeyer(state, "DifferenceKeyer", {{"Low", 0.0}, {"High", 0.1}});
}
BENCHMARK(BM_DifferenceKeyer_AgainstCanvas)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
