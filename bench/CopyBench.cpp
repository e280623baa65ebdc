// The floor of every full-frame tool: copying a UHD RGBA float32 frame into a
// new image (allocation and page faults included, as a tool's output pays
// them), and into an image whose rows already exist; and the same first copy
// for a one-channel float32 frame, the floor of a mask.
#include "bench/BenchSupport.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"

namespace Orvane::Bench {
namespace {

void BM_CopyFloor(benchmark::State &state) {
    const Image *frame = UhdFrame().Get();
    for (auto _ : state) {
        Ref<Image> copy = NewImageTagList({{ImgLikeImage, frame}});
        copy->ImageCopy(frame);
        benchmark::DoNotOptimize(copy.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_CopyFloor)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_CopyIntoExistingRows(benchmark::State &state) {
    const Image *frame = UhdFrame().Get();
    Ref<Image> copy = NewImageTagList({{ImgLikeImage, frame}});
    copy->AllocScanLineData();
    for (auto _ : state) {
        copy->ImageCopy(frame);
        benchmark::DoNotOptimize(copy.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_CopyIntoExistingRows)->UseRealTime()->Unit(benchmark::kMillisecond);

/// The floor of a full-frame mask: a UHD one-channel float32 frame copied into a new image.
void BM_CopyFloorMaskFloat(benchmark::State &state) {
    Ref<Image> mask = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthAFlt32}});
    mask->Fill(FltPixel{0.5f, 0.5f, 0.5f, 0.5f});
    for (auto _ : state) {
        Ref<Image> copy = NewImageTagList({{ImgLikeImage, mask.Get()}});
        copy->ImageCopy(mask.Get());
        benchmark::DoNotOptimize(copy.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_CopyFloorMaskFloat)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
