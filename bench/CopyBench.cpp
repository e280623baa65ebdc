// The floor of every full-frame tool: copying a UHD RGBA float32 frame into a
// new image (allocation and page faults included, as a tool's output pays
// them), and into an image whose rows already exist.
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

// The floor of a full-frame mask: a UHD one-channel float frame copied into a new image.
void BM_CopyFloorAFlt32(benchmark::State &state) {
    Ref<Image> frame = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthAFlt32}});
    frame->AllocScanLineData();
    frame->Fill({0.5f, 0.5f, 0.5f, 0.5f});
    for (auto _ : state) {
        Ref<Image> copy = NewImageTagList({{ImgLikeImage, frame.Get()}});
        copy->ImageCopy(frame.Get());
        benchmark::DoNotOptimize(copy.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_CopyFloorAFlt32)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
