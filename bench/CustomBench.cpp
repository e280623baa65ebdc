// The Custom tool's expressions on a UHD RGBA float32 frame through the engine, cache off:
//   Grade     r1*1.2+0.01 on red, green and blue (alpha a1): the plain per-pixel path
//   Sampler   getr1b(x+0.01, y) on red: a bilinear sample per pixel through the image API
// beside the same grade in compiled rows (Brightness/Contrast, Gain 1.2 and Brightness 0.01),
// and oiiotool doing the same multiply and add (--mulc, --addc) in the same run.
// Compare with BM_CopyFloor (CopyBench.cpp), the memory-bandwidth floor.
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"

namespace Orvane::Bench {
namespace {

void RunCustom(benchmark::State &state, const std::vector<std::pair<const char *, const char *>> &expressions) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Operator *tool = AddToolOnFrame(state, doc, "Custom", {});
    if (!tool) return;
    for (const auto &[id, text] : expressions) tool->FindInput(id)->SetValue(MakeRef<Text>(text));
    RenderLoop(state, tool);
}

void BM_Custom_Grade(benchmark::State &state) {
    RunCustom(
        state,
        {{"RedExpression", "r1*1.2+0.01"}, {"GreenExpression", "g1*1.2+0.01"}, {"BlueExpression", "b1*1.2+0.01"}});
}
BENCHMARK(BM_Custom_Grade)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Custom_Sampler(benchmark::State &state) { RunCustom(state, {{"RedExpression", "getr1b(x+0.01, y)"}}); }
BENCHMARK(BM_Custom_Sampler)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Custom_CompiledGrade(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    if (Operator *tool = AddToolOnFrame(state, doc, "BrightnessContrast", {{"Gain", 1.2}, {"Brightness", 0.01}}))
        RenderLoop(state, tool);
}
BENCHMARK(BM_Custom_CompiledGrade)->UseRealTime()->Unit(benchmark::kMillisecond);

[[maybe_unused]] const bool s_peers = [] {
    RegisterPeerBenchmark(
        "oiiotool_grade", "oiiotool",
        [] {
            const std::string &in = PeerUHDFrame(".exr");
            if (in.empty()) return std::string();
            return in + " --mulc 1.2,1.2,1.2,1 --addc 0.01,0.01,0.01,0 -d float --compression none -o " +
                   PeerOutput(".exr");
        },
        "addc");
    return true;
}();

} // namespace
} // namespace Orvane::Bench
