// The merge on UHD RGBA float32 frames, and what bounds it:
//   Merge/OverRows            MergeImagesTagList, Normal Over, into a new image
//                             (allocation and page faults included, as a tool pays)
//   Merge/OverRowsIntoRows    the same into an image whose rows exist
//   Merge/ScreenRows          Screen, the same way
//   Merge/Tool                the Merge tool through the engine, cache off
//   Merge/TransformMergeChain a Transform (15 degrees, size 0.8, linear) into
//                             a Merge over the frame, through the engine
//   Merge/BandwidthFloor      reading two frames and writing one (a + b per
//                             float, rows in parallel on the same pool) into a
//                             new image: no merge can beat it
//   Merge/BandwidthFloorIntoRows   the same into existing rows
//   Peer/oiiotool_over, Peer/vips_composite2_over   the peers, whole
//                             commands; "op_s" is the operation alone
#include <algorithm>
#include <cstring>
#include <functional>
#include <string>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/image/MergeModes.h"
#include "host/image/NewImage.h"

namespace Orvane::Bench {
namespace {

/// A UHD foreground with alpha across 0..1 (premultiplied), so that the
/// hold-out does real work.
const Ref<Image> &Foreground() {
    static const Ref<Image> fg = [] {
        Ref<Image> img = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthRGBAFlt32}});
        img->AllocScanLineData();
        for (int y = 0; y < kHeight; ++y) {
            float *row = img->Row<float>(y);
            for (int x = 0; x < kWidth; ++x) {
                const float a = static_cast<float>((x + 3 * y) % 997) / 996.f;
                row[4 * x + 0] = 0.8f * a;
                row[4 * x + 1] = 0.3f * a;
                row[4 * x + 2] = 0.5f * a;
                row[4 * x + 3] = a;
            }
        }
        return img;
    }();
    return fg;
}

void MergeRows(benchmark::State &state, int mode, bool existingRows) {
    const Image *fg = Foreground().Get();
    const Image *bg = UhdFrame().Get();
    const TagList tags{{MrgApplyMode, mode}};
    Ref<Image> kept = NewImageTagList({{ImgLikeImage, bg}});
    if (existingRows) kept->AllocScanLineData();
    for (auto _ : state) {
        Ref<Image> out = existingRows ? kept : NewImageTagList({{ImgLikeImage, bg}});
        if (!MergeImagesTagList(fg, bg, out.Get(), tags)) {
            state.SkipWithError("the merge failed");
            return;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    ReportPixels(state);
}

void BM_MergeOverRows(benchmark::State &state) { MergeRows(state, MrgNormal, false); }
BENCHMARK(BM_MergeOverRows)->Name("Merge/OverRows")->UseRealTime()->Unit(benchmark::kMillisecond);
void BM_MergeOverRowsIntoRows(benchmark::State &state) { MergeRows(state, MrgNormal, true); }
BENCHMARK(BM_MergeOverRowsIntoRows)->Name("Merge/OverRowsIntoRows")->UseRealTime()->Unit(benchmark::kMillisecond);
void BM_MergeScreenRows(benchmark::State &state) { MergeRows(state, MrgScreen, false); }
BENCHMARK(BM_MergeScreenRows)->Name("Merge/ScreenRows")->UseRealTime()->Unit(benchmark::kMillisecond);

/// Two frames read, one written: out = a + b per float, rows in parallel.
void Floor(benchmark::State &state, bool existingRows) {
    const Image *a = Foreground().Get();
    const Image *b = UhdFrame().Get();
    Ref<Image> kept = NewImageTagList({{ImgLikeImage, b}});
    if (existingRows) kept->AllocScanLineData();
    for (auto _ : state) {
        Ref<Image> out = existingRows ? kept : NewImageTagList({{ImgLikeImage, b}});
        out->AllocScanLineData();
        ParallelRange(
            0, kHeight,
            [&](int y0, int y1) {
                for (int y = y0; y < y1; ++y) {
                    const float *pa = a->Row<float>(y), *pb = b->Row<float>(y);
                    std::transform(pa, pa + 4 * kWidth, pb, out->Row<float>(y), std::plus<float>());
                }
            },
            4);
        benchmark::DoNotOptimize(out.Get());
    }
    ReportPixels(state);
}

void BM_MergeFloor(benchmark::State &state) { Floor(state, false); }
BENCHMARK(BM_MergeFloor)->Name("Merge/BandwidthFloor")->UseRealTime()->Unit(benchmark::kMillisecond);
void BM_MergeFloorIntoRows(benchmark::State &state) { Floor(state, true); }
BENCHMARK(BM_MergeFloorIntoRows)->Name("Merge/BandwidthFloorIntoRows")->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_MergeTool(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Output *bg = AddFrameSource(doc); // the frame source's class exists from here on
    Operator *second = doc.AddTool(OvID("BenchFrameSource"), "Frame2");
    Output *fg = second ? second->FindMainOutput() : nullptr;
    Operator *merge = doc.AddTool(OvID("Merge"));
    if (!bg || !fg || !merge || !merge->FindInput("Background")->ConnectTo(bg) ||
        !merge->FindInput("Foreground")->ConnectTo(fg)) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    RenderLoop(state, merge);
}
BENCHMARK(BM_MergeTool)->Name("Merge/Tool")->UseRealTime()->Unit(benchmark::kMillisecond);

// A Transform (turned 15 degrees, size 0.8, linear) merged over the frame:
// the foreground is resampled once, straight into the background.
void BM_TransformMergeChain(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Output *bg = AddFrameSource(doc);
    Operator *second = doc.AddTool(OvID("BenchFrameSource"), "Frame2");
    Operator *turn = doc.AddTool(OvID("Transform"));
    Operator *merge = doc.AddTool(OvID("Merge"));
    if (!bg || !second || !turn || !merge || !turn->FindInput("Input")->ConnectTo(second->FindMainOutput()) ||
        !merge->FindInput("Background")->ConnectTo(bg) ||
        !merge->FindInput("Foreground")->ConnectTo(turn->FindMainOutput())) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    turn->FindInput("Angle")->SetValue(MakeRef<Number>(15.0));
    turn->FindInput("Size")->SetValue(MakeRef<Number>(0.8));
    RenderLoop(state, merge);
}
BENCHMARK(BM_TransformMergeChain)->Name("Merge/TransformMergeChain")->UseRealTime()->Unit(benchmark::kMillisecond);

// The peers on the same frame as foreground and background (opaque, so the
// work is that of any over), registered at load time.
const bool kPeersRegistered = [] {
    RegisterPeerBenchmark(
        "oiiotool_over", "oiiotool",
        [] {
            const std::string &in = PeerUHDFrame(".exr");
            if (in.empty()) return std::string();
            return in + " " + in + " --over -d float --compression none -o " + PeerOutput(".exr");
        },
        "over");
    // The same chain: turn and shrink the foreground, then lay it over.
    RegisterPeerBenchmark("oiiotool_rotate_over_chain", "oiiotool", [] {
        const std::string &in = PeerUHDFrame(".exr");
        if (in.empty()) return std::string();
        return in + " --rotate:filter=triangle:recompute_roi=0 15 --resize:filter=triangle 3072x1728 " + in +
               " --over -d float --compression none -o " + PeerOutput(".exr");
    });
    RegisterPeerBenchmark("vips_similarity_composite2_chain", "vips", [] {
        const std::string &in = PeerUHDFrame(".v");
        if (in.empty()) return std::string();
        const std::string turned = PeerOutput(".v");
        return "similarity " + in + " " + turned +
               " --scale 0.8 --angle 15 --interpolate bilinear && vips composite2 " + in + " " + turned + " " +
               PeerOutput(".v") + " over --premultiplied";
    });
    RegisterPeerBenchmark("vips_composite2_over", "vips", [] {
        const std::string &in = PeerUHDFrame(".v");
        if (in.empty()) return std::string();
        return "composite2 " + in + " " + in + " " + PeerOutput(".v") + " over --premultiplied";
    });
    return true;
}();

} // namespace
} // namespace Orvane::Bench
