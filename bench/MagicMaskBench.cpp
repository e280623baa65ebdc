// Object mattes from strokes: the classical provider of "GetObjectMask" on the synthetic moving-object sequence
// (tests/support/BlobSequence.h) at 1920x1080, called as the tool calls it. One iteration is a whole run: the
// reference frame from strokes, then the mask carried through the remaining frames. Only the provider's calls are
// timed (the frames are made outside the clock). Counters:
//   s_per_frame  seconds per tracked frame (the reference frame excluded)
//   ref_s        seconds for the reference frame
//   iou_mean, iou_min  intersection over union of matte >= 0.5 with the true mask, over all frames
#include <algorithm>
#include <chrono>
#include <memory>

#include <benchmark/benchmark.h>

#include "host/krom/KernelProvider.h"
#include "host/segment/BuiltinProviders.h"
#include "tests/support/BlobSequence.h"

namespace Orvane::Bench {
namespace {

namespace blob = Orvane::Test;

void BM_MagicMaskTrack(benchmark::State &state) {
    constexpr int width = 1920, height = 1080;
    const bool better = state.range(0) != 0;
    RegisterBuiltinProviders();
    double trackSeconds = 0, refSeconds = 0, iouSum = 0, iouMin = 1;
    int runs = 0;
    for (auto _ : state) {
        PurgeKROMMagicMaskTrackerCache();
        Ref<Image> carried;
        double runSeconds = 0;
        for (int frame = 0; frame < blob::kBlobFrames; ++frame) {
            Ref<Image> picture = blob::MakeBlobFrame(width, height, frame);
            auto block = std::make_shared<OrvaneSemanticSegmentationParams>();
            block->operatorId = 1;
            block->timeStamp = frame;
            block->isBetterMode = better;
            block->isTracking = 1;
            block->isRefframe = block->isKeyframe = frame == 0;
            block->hasCachePropMask = frame > 0;
            const auto pos = frame == 0 ? blob::BlobPositiveStrokes(width, height, 0) : std::vector<float>{};
            const auto neg = frame == 0 ? blob::BlobNegativeStrokes(width, height, 0) : std::vector<float>{};
            const auto start = std::chrono::steady_clock::now();
            blob::ObjectMaskRun r = blob::RunObjectMask(*picture, carried.Get(), block, sizeof *block, pos, neg);
            const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
            if (!r.ok) {
                state.SkipWithError(r.error.c_str());
                return;
            }
            runSeconds += seconds;
            (frame == 0 ? refSeconds : trackSeconds) += seconds;
            const double iou = blob::BlobIoU(*r.matte, width, height, frame);
            iouSum += iou;
            iouMin = std::min(iouMin, iou);
            carried = r.carry;
        }
        state.SetIterationTime(runSeconds);
        ++runs;
    }
    state.counters["s_per_frame"] = trackSeconds / (runs * (blob::kBlobFrames - 1));
    state.counters["ref_s"] = refSeconds / runs;
    state.counters["iou_mean"] = iouSum / (runs * blob::kBlobFrames);
    state.counters["iou_min"] = iouMin;
}
BENCHMARK(BM_MagicMaskTrack)
    ->ArgName("better")
    ->Arg(0)
    ->Arg(1)
    ->UseManualTime()
    ->Unit(benchmark::kSecond)
    ->Iterations(1);

} // namespace
} // namespace Orvane::Bench
