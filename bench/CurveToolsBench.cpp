// The curve tools on a UHD RGBA float32 frame through the engine, cache off:
//   ColorCurves   red, green, blue curves after a luminance curve: four tables of 65536 samples
//                 built per request, then read between samples for every value
//   HueCurves     all three hue curves: HLS there and back in double per pixel
// Compare with BM_CopyFloor (CopyBench.cpp), the memory-bandwidth floor.
#include "bench/BenchSupport.h"
#include "host/color/SplineCurve.h"

namespace Orvane::Bench {
namespace {

void RunCurves(benchmark::State &state, const char *classId,
               const std::vector<std::pair<const char *, std::vector<CurvePoint>>> &curves) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Operator *tool = AddToolOnFrame(state, doc, classId, {});
    if (!tool) return;
    for (const auto &[id, points] : curves) tool->FindInput(id)->SetValue(MakeRef<SplineCurve>(points));
    RenderLoop(state, tool);
}

void BM_ColorCurves_ThroughLuminance(benchmark::State &state) {
    RunCurves(state, "ColorCurves",
              {{"Red", {{0, 0.05}, {0.3, 0.5}, {1, 0.9}}},
               {"Green", {{0, 0}, {0.5, 0.6}, {1, 1}}},
               {"Blue", {{0, 0.1}, {1, 0.8}}},
               {"Luminance", {{0, 0}, {0.25, 0.35}, {1, 1}}}});
}
BENCHMARK(BM_ColorCurves_ThroughLuminance)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_HueCurves_AllThree(benchmark::State &state) {
    RunCurves(state, "HueCurves",
              {{"Hue", {{0.1, 0.05}, {0.6, -0.05}}},
               {"Saturation", {{0.2, 1.3}, {0.7, 0.8}}},
               {"Luminance", {{0.3, 1.1}, {0.8, 0.9}}}});
}
BENCHMARK(BM_HueCurves_AllThree)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
