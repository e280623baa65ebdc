// Resizing a UHD RGBA float32 frame to 1920x1080 (a shrink by 2 on both
// axes) with Lanczos and with linear filtering.
//
//   Resize/UHDtoHD/<filter>          ours, in process: Image::ResizeTagList into
//                                    a new image (its rows, page faults
//                                    included), tables built in the call.
//   Resize/UHDtoHDCachedTables/...   the same with tables from
//                                    ResizePreCalcTagList, as the sizing tools
//                                    keep them between frames.
//   Resize/UHDtoHDInt8/<filter>      an 8-bit RGBA frame of the same content
//                                    (conversion on read and on store).
//   Resize/UHDtoHDUp/<filter>        1920x1080 up to UHD (a stretch by 2).
//   Peer/oiiotool_*, Peer/vips_*     the same resizes by OpenImageIO's oiiotool
//                                    (filters lanczos3, triangle) and vips
//                                    (kernels lanczos3, linear), whole process
//                                    (load, resize, save) as the row's time;
//                                    counter op_s is the resize alone (oiiotool's
//                                    --runstats figure; for vips the whole minus
//                                    a plain copy of the same files, which
//                                    writes four times the bytes, so it runs
//                                    low: Peer/vips_UHDtoHD_subsample_io, the
//                                    same load and save without filtering, is
//                                    the better figure to subtract).
#include <string>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/image/ResizeFilters.h"

namespace Orvane::Bench {
namespace {

constexpr int kHdWidth = 1920, kHdHeight = 1080;

const char *FilterName(int filter) { return filter == RszLanczos ? "Lanczos" : "Linear"; }

void Resize(benchmark::State &state, const Image *src, int width, int height, bool cached) {
    const int filter = static_cast<int>(state.range(0));
    state.SetLabel(FilterName(filter));
    const TagList tags{{ResizeFilter, filter}};
    Ref<Image> probe = NewImageTagList({{ImgLikeImage, src}, {ImgWidth, width}, {ImgHeight, height}});
    void *tx = nullptr, *ty = nullptr;
    if (cached && !src->ResizePreCalcTagList(probe.Get(), tx, ty, tags)) {
        state.SkipWithError("no tables");
        return;
    }
    for (auto _ : state) {
        Ref<Image> out = NewImageTagList({{ImgLikeImage, src}, {ImgWidth, width}, {ImgHeight, height}});
        if (!src->ResizeTagList(out.Get(), tx, ty, tags)) {
            state.SkipWithError("the resize failed");
            break;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    Image::ResizePostCalc(tx, ty);
    state.counters["out_Mpix/s"] =
        benchmark::Counter(static_cast<double>(width) * height * state.iterations() / 1e6, benchmark::Counter::kIsRate);
}

void BM_ResizeUHDtoHD(benchmark::State &state) { Resize(state, UhdFrame().Get(), kHdWidth, kHdHeight, false); }
void BM_ResizeUHDtoHDCachedTables(benchmark::State &state) {
    Resize(state, UhdFrame().Get(), kHdWidth, kHdHeight, true);
}

void BM_ResizeUHDtoHDInt8(benchmark::State &state) {
    static const Ref<Image> frame8 = [] {
        Ref<Image> img = NewImageTagList({{ImgLikeImage, UhdFrame().Get()}, {ImgDepth, DepthRGBAInt8}});
        img->ImageCopy(UhdFrame().Get());
        return img;
    }();
    Resize(state, frame8.Get(), kHdWidth, kHdHeight, false);
}

void BM_ResizeHDtoUHD(benchmark::State &state) {
    static const Ref<Image> hd = [] {
        Ref<Image> img =
            NewImageTagList({{ImgLikeImage, UhdFrame().Get()}, {ImgWidth, kHdWidth}, {ImgHeight, kHdHeight}});
        UhdFrame()->ResizeTagList(img.Get(), {{ResizeFilter, RszBox}});
        return img;
    }();
    Resize(state, hd.Get(), kWidth, kHeight, false);
}

BENCHMARK(BM_ResizeUHDtoHD)
    ->Name("Resize/UHDtoHD")
    ->Arg(RszLanczos)
    ->Arg(RszLinear)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ResizeUHDtoHDCachedTables)
    ->Name("Resize/UHDtoHDCachedTables")
    ->Arg(RszLanczos)
    ->Arg(RszLinear)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ResizeUHDtoHDInt8)
    ->Name("Resize/UHDtoHDInt8")
    ->Arg(RszLanczos)
    ->Arg(RszLinear)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ResizeHDtoUHD)
    ->Name("Resize/HDtoUHD")
    ->Arg(RszLanczos)
    ->Arg(RszLinear)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

// The peers, registered at load time; their frames are made when a row runs.
const bool kPeersRegistered = [] {
    auto oiio = [](const char *filter) {
        return [filter] {
            const std::string &in = PeerUHDFrame(".exr");
            if (in.empty()) return std::string();
            return in + " --resize:filter=" + filter + " 1920x1080 -d float --compression none -o " +
                   PeerOutput(".exr");
        };
    };
    auto vips = [](const char *kernel) {
        return [kernel] {
            const std::string &in = PeerUHDFrame(".v");
            if (in.empty()) return std::string();
            return "resize " + in + " " + PeerOutput(".v") + " 0.5 --kernel " + kernel;
        };
    };
    RegisterPeerBenchmark("oiiotool_UHDtoHD_lanczos3", "oiiotool", oiio("lanczos3"), "resize");
    RegisterPeerBenchmark("oiiotool_UHDtoHD_triangle", "oiiotool", oiio("triangle"), "resize");
    RegisterPeerBenchmark("vips_UHDtoHD_lanczos3", "vips", vips("lanczos3"));
    RegisterPeerBenchmark("vips_UHDtoHD_linear", "vips", vips("linear"));
    // The same files through vips without filtering (every second pixel):
    // what a vips resize pays to load and save, to subtract from its rows.
    RegisterPeerBenchmark("vips_UHDtoHD_subsample_io", "vips", [] {
        const std::string &in = PeerUHDFrame(".v");
        return in.empty() ? std::string() : "subsample " + in + " " + PeerOutput(".v") + " 2 2";
    });
    return true;
}();

} // namespace
} // namespace Orvane::Bench
