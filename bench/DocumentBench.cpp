// Flow documents at scale: a chain of N Brightness/Contrast tools behind a
// small Background, as text.
//
//   Document/Load/N         parse, make the tools, apply and link every value
//                           (what `orvane check` does); linear in N
//   Document/Save/N         write the loaded flow back as text
//   Document/EvaluateEnd/N  load, then evaluate the last tool of the chain at
//                           64 x 64: the walk and the cache keys over N tools
//                           (on the benchmark's own 8 MiB stack, so N stays
//                           below what the command line's deep stack allows)
#include <string>

#include "bench/BenchSupport.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/RenderTask.h"

namespace Orvane::Bench {
namespace {

std::string Chain(int n) {
    std::string text =
        "Orvane.Document {\n\tTools = {\n\t\tBG = Background { Inputs = { Width = 64, Height = 64 } },\n";
    for (int i = 0; i < n; ++i)
        text += "\t\tBC" + std::to_string(i) + " = BrightnessContrast { Inputs = { Gain = 1.01, Input = " +
                (i ? "BC" + std::to_string(i - 1) : std::string("BG")) + ".Output } },\n";
    return text + "\t},\n}\n";
}

void BM_Load(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    const std::string text = Chain(static_cast<int>(state.range(0)));
    for (auto _ : state) {
        OrvaneDoc doc;
        if (!LoadDocument(text, doc).ok) state.SkipWithError("the chain did not load");
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_Load)->Name("Document/Load")->Arg(1000)->Arg(8000)->Arg(50000)->Unit(benchmark::kMillisecond);

void BM_Save(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    if (!LoadDocument(Chain(static_cast<int>(state.range(0))), doc).ok) state.SkipWithError("the chain did not load");
    for (auto _ : state) benchmark::DoNotOptimize(SaveDocument(doc));
    state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_Save)->Name("Document/Save")->Arg(8000)->Unit(benchmark::kMillisecond);

void BM_EvaluateEnd(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    const int n = static_cast<int>(state.range(0));
    const std::string text = Chain(n);
    for (auto _ : state) {
        OrvaneDoc doc;
        if (!LoadDocument(text, doc).ok) state.SkipWithError("the chain did not load");
        RenderTask task;
        EvalOptions options;
        options.task = &task;
        benchmark::DoNotOptimize(Evaluate(doc.FindTool("BC" + std::to_string(n - 1))->FindMainOutput(), 0.0, options));
    }
}
BENCHMARK(BM_EvaluateEnd)->Name("Document/EvaluateEnd")->Arg(1000)->Arg(4000)->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
