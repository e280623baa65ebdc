// The Delta Keyer on a UHD RGBA float32 frame through the engine, cache off:
//   DeltaKeyer_Screen   the screen pass alone (a green background, nothing else)
//   DeltaKeyer_Chain    a typical key: pre-matte ranges, threshold, restore fringe, a small erode, matte
//                       blur and hard-colour replace, then colour max
// Compare with BM_CopyFloor (CopyBench.cpp), the memory-bandwidth floor.
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"
#include "host/flow/InputValue.h"

namespace Orvane::Bench {
namespace {

void RunKeyer(benchmark::State &state, const std::vector<std::pair<const char *, double>> &settings,
              const std::vector<std::pair<const char *, const char *>> &ids) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Output *source = AddFrameSource(doc);
    Operator *tool = doc.AddTool(OvID("DeltaKeyer"));
    if (!source || !tool) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    tool->FindInput("Input")->ConnectTo(source);
    for (const auto &[id, value] : settings) tool->FindInput(id)->SetValue(MakeRef<Number>(value));
    for (const auto &[id, value] : ids) tool->FindInput(id)->SetValue(MakeRef<IDValue>(OvID(value)));
    RenderLoop(state, tool);
}

const std::vector<std::pair<const char *, double>> kGreen = {
    {"BackgroundRed", 0.1}, {"BackgroundGreen", 0.7}, {"BackgroundBlue", 0.25}};

void BM_DeltaKeyer_Screen(benchmark::State &state) { RunKeyer(state, kGreen, {}); }
BENCHMARK(BM_DeltaKeyer_Screen)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_DeltaKeyer_Chain(benchmark::State &state) {
    std::vector<std::pair<const char *, double>> settings = kGreen;
    settings.insert(settings.end(), {{"PreMatteLowGreen", 0.6},
                                     {"PreMatteHighRed", 0.3},
                                     {"PreMatteSoftRange", 0.05},
                                     {"LowThreshold", 0.05},
                                     {"HighThreshold", 0.95},
                                     {"RestoreFringe", 0.002},
                                     {"ErodeDilate", -0.001},
                                     {"Blur", 1.0}});
    RunKeyer(state, settings, {{"ReplaceMode", "HardColor"}});
}
BENCHMARK(BM_DeltaKeyer_Chain)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
