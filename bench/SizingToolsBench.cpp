// The sizing tools on a UHD RGBA float32 frame through the engine, cache
// off (what a render pays per frame):
//
//   SizingTools/Resize/<filter>      Resize to 1920x1080; the tool keeps its
//                                    coefficient tables from frame to frame
//   SizingTools/ResizeNewTables/...  the same with a new size every frame
//                                    (1920 / 1921 alternating), so the tables
//                                    are made each time: the cost they save
//   SizingTools/Scale                Scale 0.5, Catmull-Rom
//   SizingTools/Letterbox            UHD into 1440x1080 between bars, Linear
//   SizingTools/Crop                 a 1920x1080 cut from the middle
//   Peer/oiiotool_cut_HD, Peer/vips_crop_HD   the same cut by the peers,
//                                    whole process (load, cut, save); op_s
//                                    is the cut alone. The peers' resizes
//                                    are rows of ResizeBench.cpp.
#include <string>
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/flow/Engine.h"
#include "host/image/ResizeFilters.h"

namespace Orvane::Bench {
namespace {

/// A tool of `cls` reading the UHD frame with these number settings; null
/// (and the row skipped) when it cannot be made.
Operator *MakeTool(benchmark::State &state, OrvaneDoc &doc, const char *cls,
                   const std::vector<std::pair<const char *, double>> &settings) {
    if (!LoadLibrary(state)) return nullptr;
    Output *source = AddFrameSource(doc);
    Operator *tool = doc.AddTool(OvID(cls));
    if (!source || !tool || !tool->FindInput("Input")->ConnectTo(source)) {
        state.SkipWithError("cannot make the tools");
        return nullptr;
    }
    for (const auto &[id, value] : settings) tool->FindInput(id)->SetValue(MakeRef<Number>(value));
    return tool;
}

const char *FilterLabel(int method) { return method == 8 ? "Lanczos" : method == 5 ? "CatmullRom" : "Linear"; }

void BM_Resize(benchmark::State &state) {
    const int method = static_cast<int>(state.range(0));
    state.SetLabel(FilterLabel(method));
    OrvaneDoc doc;
    if (Operator *tool =
            MakeTool(state, doc, "BetterResize", {{"Width", 1920}, {"Height", 1080}, {"FilterMethod", method}}))
        RenderLoop(state, tool);
}
BENCHMARK(BM_Resize)->Name("SizingTools/Resize")->Arg(8)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ResizeNewTables(benchmark::State &state) {
    const int method = static_cast<int>(state.range(0));
    state.SetLabel(FilterLabel(method));
    OrvaneDoc doc;
    Operator *tool =
        MakeTool(state, doc, "BetterResize", {{"Width", 1920}, {"Height", 1080}, {"FilterMethod", method}});
    if (!tool) return;
    EvalOptions options;
    options.useCache = false;
    int width = 1920;
    for (auto _ : state) {
        state.PauseTiming();
        width = width == 1920 ? 1921 : 1920;
        tool->FindInput("Width")->SetValue(MakeRef<Number>(width));
        state.ResumeTiming();
        Ref<Parameter> out = Evaluate(tool->FindMainOutput(), 0.0, options);
        if (!out) {
            state.SkipWithError("the tool gave no image");
            break;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_ResizeNewTables)
    ->Name("SizingTools/ResizeNewTables")
    ->Arg(8)
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_Scale(benchmark::State &state) {
    OrvaneDoc doc;
    if (Operator *tool = MakeTool(state, doc, "Scale", {{"XSize", 0.5}, {"FilterMethod", 5}})) RenderLoop(state, tool);
}
BENCHMARK(BM_Scale)->Name("SizingTools/Scale")->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Letterbox(benchmark::State &state) {
    OrvaneDoc doc;
    if (Operator *tool = MakeTool(state, doc, "Letterbox", {{"Width", 1440}, {"Height", 1080}}))
        RenderLoop(state, tool);
}
BENCHMARK(BM_Letterbox)->Name("SizingTools/Letterbox")->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Crop(benchmark::State &state) {
    OrvaneDoc doc;
    if (Operator *tool =
            MakeTool(state, doc, "Crop", {{"XOffset", 960}, {"YOffset", 540}, {"XSize", 1920}, {"YSize", 1080}}))
        RenderLoop(state, tool);
}
BENCHMARK(BM_Crop)->Name("SizingTools/Crop")->UseRealTime()->Unit(benchmark::kMillisecond);

const bool kPeersRegistered = [] {
    RegisterPeerBenchmark(
        "oiiotool_cut_HD", "oiiotool",
        [] {
            const std::string &in = PeerUHDFrame(".exr");
            if (in.empty()) return std::string();
            return in + " --cut 1920x1080+960+540 -d float --compression none -o " + PeerOutput(".exr");
        },
        "cut");
    RegisterPeerBenchmark("vips_crop_HD", "vips", [] {
        const std::string &in = PeerUHDFrame(".v");
        if (in.empty()) return std::string();
        return "crop " + in + " " + PeerOutput(".v") + " 960 540 1920 1080";
    });
    return true;
}();

} // namespace
} // namespace Orvane::Bench
