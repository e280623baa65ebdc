// The soft band of a double-polyline mask: a strip between two concentric
// circles of radii 0.3 and 0.35 of the width, one sample pair per pixel of
// the outer circle's length, drawn into a UHD one-channel float mask at 1
// (preview), 8 (closed solid line) and 32 (otherwise) sub-samples per pixel
// side. Compare with BM_CopyFloorAFlt32 in CopyBench.cpp and with the blur of
// such a mask, BM_MaskBlurFastGaussian.
#include <cmath>
#include <vector>

#include "bench/BenchSupport.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/shape/StripRasterizer.h"

namespace Orvane::Bench {
namespace {

void BM_StripBand(benchmark::State &state) {
    const double pi = std::acos(-1.0), cx = kWidth / 2.0, cy = kHeight / 2.0;
    const double rIn = 0.3 * kWidth, rOut = 0.35 * kWidth;
    const int pairs = static_cast<int>(std::lround(2 * pi * rOut));
    std::vector<StripPoint> strip;
    for (int i = 0; i <= pairs; ++i) {
        const double a = 2 * pi * (i % pairs) / pairs;
        strip.push_back({cx + rIn * std::cos(a), cy + rIn * std::sin(a)});
        strip.push_back({cx + rOut * std::cos(a), cy + rOut * std::sin(a)});
    }
    Ref<Image> mask = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthAFlt32}});
    mask->AllocScanLineData();
    StripRasterOptions options;
    options.subSamples = static_cast<int>(state.range(0));
    for (auto _ : state) {
        if (!RasterizeStrip(strip.data(), strip.size(), mask.Get(), options).Ok()) state.SkipWithError("band dropped");
        benchmark::DoNotOptimize(mask.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_StripBand)->Arg(1)->Arg(8)->Arg(32)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
