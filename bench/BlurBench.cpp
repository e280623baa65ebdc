// Blurring a UHD RGBA float32 frame with a Gaussian of sigma 10 and 50 pixels.
//
//   Blur/UHD/<kind>/<sigma>   ours, in process: Image::BlurOfImageTagList into
//                             a new image (its rows included) at the size whose
//                             sigma is that many pixels (size = 2 sigma / 3840);
//                             kinds: Gaussian (direct, 4 sigma each side),
//                             FastGaussian (five extended boxes), VYV5 (the
//                             five-pole recursion), and Box for scale.
//   Blur/UHDDevice/<kind>/<sigma>/<device>  the same through the kernels
//                             "BlurRows"/"BlurColumns" on OpenCL (1) or CUDA (2),
//                             the frame's upload kept on it (resident), the
//                             result downloaded into fresh rows. Without a GPU
//                             the OpenCL device is PoCL on this CPU: it measures
//                             that driver, not a GPU.
//   Peer/oiiotool_*           OpenImageIO's oiiotool, whole process (load, blur,
//                             save; counter op_s: the blur alone). Its --blur WxW
//                             is the sampled Gaussian of sigma W / 4 cut at
//                             2 sigma (BlurTest.cpp), run as a 2D convolution;
//                             "sep" rows give it the same kernel as two 1D
//                             passes (--kernel gaussian Wx1 --convolve, then
//                             1xW), which is its fastest form. The 2D row runs
//                             at sigma 10 only: at 50 it takes hours.
//   Peer/vips_*               vips gaussblur at the same sigma, whole process
//                             (op_s: less a plain copy): its default mask cut
//                             (min-ampl 0.2, about 1.8 sigma) and one cut at
//                             4 sigma (min-ampl 3.4e-4), our Gaussian's.
#include <string>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/krom/DeviceContext.h"

namespace Orvane::Bench {
namespace {

const char *KindName(int kind) {
    switch (kind) {
    case BlurGaussian: return "Gaussian";
    case BlurFastGaussian: return "FastGaussian";
    case BlurVYV5Gaussian: return "VYV5";
    default: return "Box";
    }
}

void BM_BlurUHD(benchmark::State &state) {
    const int kind = static_cast<int>(state.range(0));
    const double sigma = static_cast<double>(state.range(1));
    state.SetLabel(std::string(KindName(kind)) + " sigma " + std::to_string(state.range(1)));
    Image *src = UhdFrame().Get();
    const double size = 2.0 * sigma / src->Width();
    const TagList tags{{BlurFilterType, kind}, {BlurXSize, size}, {BlurYSize, size}};
    for (auto _ : state) {
        Ref<Image> out = src->BlurOfImageTagList(tags);
        if (!out) {
            state.SkipWithError("the blur failed");
            break;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    ReportPixels(state);
}

BENCHMARK(BM_BlurUHD)
    ->Name("Blur/UHD")
    ->Args({BlurGaussian, 10})
    ->Args({BlurGaussian, 50})
    ->Args({BlurFastGaussian, 10})
    ->Args({BlurFastGaussian, 50})
    ->Args({BlurVYV5Gaussian, 10})
    ->Args({BlurVYV5Gaussian, 50})
    ->Args({BlurBox, 10})
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_BlurUHDDevice(benchmark::State &state) {
    const int kind = static_cast<int>(state.range(0));
    const double sigma = static_cast<double>(state.range(1));
    std::string error;
    IDeviceContext *device = GetApp()->Device(state.range(2) == 1 ? DeviceChoice::OpenCL : DeviceChoice::CUDA, &error);
    if (!device) {
        state.SkipWithError(("no device: " + error).c_str());
        return;
    }
    state.SetLabel(std::string(KindName(kind)) + " sigma " + std::to_string(state.range(1)) + " on " +
                   device->Description());
    RenderTask task;
    task.SetDevice(device);
    Request req(nullptr, nullptr, 0.0, 0, &task);
    Image *src = UhdFrame().Get();
    const double size = 2.0 * sigma / src->Width();
    const TagList tags{
        {BlurFilterType, kind}, {BlurXSize, size}, {BlurYSize, size}, {WorkUseGPU, 1}, {WorkRequest, &req}};
    // Untimed: opens the device, compiles the kernels, uploads the frame.
    Ref<Image> first = src->BlurOfImageTagList(tags);
    if (!first || !first->IsGPUMemDirty()) {
        const auto log = task.DeviceLog();
        state.SkipWithError(log.empty() ? "the device did not run" : log.front().c_str());
        return;
    }
    for (auto _ : state) {
        Ref<Image> out = src->BlurOfImageTagList(tags);
        if (!out || !out->DownloadGPUMem()) {
            state.SkipWithError("the blur failed");
            break;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    src->SetGPUMem(nullptr, false); // the upload leaves with the benchmark
    ReportPixels(state);
}

BENCHMARK(BM_BlurUHDDevice)
    ->Name("Blur/UHDDevice")
    ->ArgsProduct({{BlurGaussian, BlurFastGaussian}, {10, 50}, {1, 2}})
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

// The peers, registered at load time; their frames are made when a row runs.
const bool kPeersRegistered = [] {
    auto oiio = [](int sigma, bool separable) {
        return [sigma, separable] {
            const std::string &in = PeerUHDFrame(".exr");
            if (in.empty()) return std::string();
            const std::string w = std::to_string(4 * sigma);
            const std::string blur =
                separable ? " --kernel gaussian " + w + "x1 --convolve --kernel gaussian 1x" + w + " --convolve"
                          : " --blur " + w + "x" + w;
            return in + blur + " -d float --compression none -o " + PeerOutput(".exr");
        };
    };
    auto vips = [](int sigma, const char *minAmpl) {
        return [sigma, minAmpl] {
            const std::string &in = PeerUHDFrame(".v");
            if (in.empty()) return std::string();
            return "gaussblur " + in + " " + PeerOutput(".v") + " " + std::to_string(sigma) + " --min-ampl " + minAmpl;
        };
    };
    RegisterPeerBenchmark("oiiotool_blur_2D_sigma10", "oiiotool", oiio(10, false), "blur");
    RegisterPeerBenchmark("oiiotool_blur_sep_sigma10", "oiiotool", oiio(10, true), "convolve");
    RegisterPeerBenchmark("oiiotool_blur_sep_sigma50", "oiiotool", oiio(50, true), "convolve");
    RegisterPeerBenchmark("vips_gaussblur_sigma10", "vips", vips(10, "0.2"));
    RegisterPeerBenchmark("vips_gaussblur_sigma50", "vips", vips(50, "0.2"));
    RegisterPeerBenchmark("vips_gaussblur_4sigma_sigma10", "vips", vips(10, "0.00034"));
    RegisterPeerBenchmark("vips_gaussblur_4sigma_sigma50", "vips", vips(50, "0.00034"));
    return true;
}();

} // namespace
} // namespace Orvane::Bench
