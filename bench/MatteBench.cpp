// The matte steps a keyer runs on its work image, in place on a UHD RGBA
// float32 frame whose rows already exist (compare BM_CopyIntoExistingRows,
// the floor of touching every pixel once, in CopyBench.cpp). The frame's alpha
// is its green ramp, so levels and blurs see varied values; the frame is
// restored between iterations outside the timing.
//
//   BM_MatteSpill          MatteCore_DoSpill, green key, Well Done, amount 1
//   BM_MatteLevels         DoLevelsFlt on alpha: threshold, expand and gamma
//   BM_MatteSoftenAlpha    MatteCore_DoSoftenChannel on alpha, Fast Gaussian,
//                          size 5 (27 pixels at 3840 wide)
//   BM_MatteMultiBoxAlpha  MatteCore_DoMultiBox on alpha, 2 passes, size 5
#include <functional>

#include "bench/BenchSupport.h"
#include "host/core/Tags.h"
#include "host/image/BlurFilters.h"
#include "host/image/NewImage.h"
#include "host/matte/MatteSteps.h"

namespace Orvane::Bench {
namespace {

/// The UHD frame with its green ramp copied into alpha.
const Ref<Image> &MatteFrame() {
    static const Ref<Image> frame = [] {
        Ref<Image> img = CopyOfImage(UhdFrame().Get());
        MatteCore_DoCopyChannel(nullptr, img.Get(), img.Get(), MatteGreen, MatteAlpha);
        return img;
    }();
    return frame;
}

void RunStep(benchmark::State &state, const std::function<bool(Image *)> &step) {
    const Image *frame = MatteFrame().Get();
    Ref<Image> work = CopyOfImage(frame);
    for (auto _ : state) {
        if (!step(work.Get())) {
            state.SkipWithError("the step failed");
            return;
        }
        benchmark::DoNotOptimize(work.Get());
        state.PauseTiming();
        work->ImageCopy(frame);
        state.ResumeTiming();
    }
    ReportPixels(state);
}

void BM_MatteSpill(benchmark::State &state) {
    RunStep(state, [](Image *img) { return MatteCore_DoSpill(nullptr, img, {1, 1.0, SpillWellDone}); });
}
BENCHMARK(BM_MatteSpill)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_MatteLevels(benchmark::State &state) {
    const TagList tags{
        {MatteLevelsLow, 0.1}, {MatteLevelsHigh, 0.9}, {MatteLevelsContrast, 0.2}, {MatteLevelsGamma, 1.8}};
    RunStep(state, [&tags](Image *img) { return DoLevelsFlt(nullptr, img, tags); });
}
BENCHMARK(BM_MatteLevels)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_MatteSoftenAlpha(benchmark::State &state) {
    RunStep(state,
            [](Image *img) { return MatteCore_DoSoftenChannel(nullptr, img, MatteAlpha, 5.0, 4, BlurFastGaussian); });
}
BENCHMARK(BM_MatteSoftenAlpha)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_MatteMultiBoxAlpha(benchmark::State &state) {
    RunStep(state, [](Image *img) { return MatteCore_DoMultiBox(nullptr, img, MatteAlpha, 5.0, 2); });
}
BENCHMARK(BM_MatteMultiBoxAlpha)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
