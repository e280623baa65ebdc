// The histogram pre-pass of colour correction on the UHD RGBA float32 frame:
//   Count        every pixel into 65536 bins (L, R, G, B)
//   CountProxy4  every fourth pixel of every fourth row
//   Equalize     building the four 65536-entry curves from the counts (no pixels)
// Compare Count with BM_CopyFloor (CopyBench.cpp): both read the whole frame once.
#include "bench/BenchSupport.h"
#include "host/color/Histogram.h"

namespace Orvane::Bench {
namespace {

void Count(benchmark::State &state, int proxyStep) {
    const Image &frame = *UhdFrame();
    Histogram h(65536);
    for (auto _ : state) {
        if (!h.CountImage(frame, frame.DataWindow(), {proxyStep, false})) state.SkipWithError("counting failed");
        benchmark::DoNotOptimize(h.Samples());
    }
    ReportPixels(state);
}

void BM_Histogram_Count(benchmark::State &state) { Count(state, 1); }
BENCHMARK(BM_Histogram_Count)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Histogram_CountProxy4(benchmark::State &state) { Count(state, 4); }
BENCHMARK(BM_Histogram_CountProxy4)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Histogram_Equalize(benchmark::State &state) {
    const Image &frame = *UhdFrame();
    Histogram h(65536);
    h.CountImage(frame, frame.DataWindow());
    for (auto _ : state) {
        h.Equalize({.luminance = true, .red = true, .green = true, .blue = true, .lockRGB = false});
        benchmark::DoNotOptimize(h.GetValueL(32768));
    }
}
BENCHMARK(BM_Histogram_Equalize)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
