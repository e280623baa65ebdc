// ColorCorrector on a UHD RGBA float32 frame through the engine, cache off:
//   MasterGain     Master gain 1.2 only: one record, the multiply-add stage alone
//   AllRanges      every range changed, with tint and suppression: three records
//                  weighted by the range curves, all stages on
//   HistogramMatch Match of luminance and locked R/G/B at 16-bit precision
//                  against a snapshot of the frame itself: each render counts
//                  the frame, builds four 65536-bin curves and corrects
// Compare with BM_CopyFloor (CopyBench.cpp), the memory-bandwidth floor.
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"
#include "host/core/Tags.h"
#include "host/flow/Link.h"
#include "host/flow/Parameter.h"

namespace Orvane::Bench {
namespace {

void RunTool(benchmark::State &state, const std::vector<std::pair<const char *, double>> &settings) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    if (Operator *tool = AddToolOnFrame(state, doc, "ColorCorrector", settings)) RenderLoop(state, tool);
}

void BM_ColorCorrector_MasterGain(benchmark::State &state) { RunTool(state, {{"MasterRGBGain", 1.2}}); }
BENCHMARK(BM_ColorCorrector_MasterGain)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ColorCorrector_AllRanges(benchmark::State &state) {
    RunTool(state, {{"MasterRGBGain", 1.1},
                    {"ShadowsRGBLift", 0.05},
                    {"MidTonesRGBGamma", 1.2},
                    {"HighlightsRGBGain", 0.9},
                    {"WheelTintLength1", 0.1},
                    {"WheelHue2", 20},
                    {"Red0", 0.5},
                    {"Blue3", 0.7},
                    {"ProcessOrder", 1}});
}
BENCHMARK(BM_ColorCorrector_AllRanges)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ColorCorrector_HistogramMatch(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Operator *tool = AddToolOnFrame(state, doc, "ColorCorrector",
                                    {{"HistogramType", 2},
                                     {"EqualizeLuminance", 1},
                                     {"EqualizeRed", 1},
                                     {"EqualizeGreen", 1},
                                     {"EqualizeBlue", 1}});
    if (!tool) return;
    tool->FindInput("SnapshotMatch")->SetValue(MakeRef<Number>(1.0));
    RenderLoop(state, tool);
}
BENCHMARK(BM_ColorCorrector_HistogramMatch)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
