// Lens Distort on the UHD RGBA float32 frame with the anamorphic degree 4 model at realistic coefficients
// (Cx02 -0.03, Cy02 -0.02, Cx22 0.004, Cx04 0.002, Cy04 0.001; the default camera), rendered from outside the
// tool in a document, cache off, as a render pays it. Run beside BM_CopyFloor (CopyBench.cpp), the copy of the
// same frame into a new image.
//
//   LensDistort/Undistort/<n>   Mode Undistort, n x n samples (1 or 2): the iterated inverse per sample.
//   LensDistort/Distort/<n>     Mode Distort: the model's direct function per sample.
//   LensDistort/DistortRadial/1 Distort with the radial degree 4 model whose map is the OpenCV row's (its two
//                               radial terms, a filmback of the frame's aspect): the same work as the peer.
//   LensDistort/OpenCV          OpenCV's radial undistort of the same frame (bench/peers/opencv_lens_remap.py):
//                               initUndistortRectifyMap (float maps) + remap, bilinear, k1 -0.03, k2 0.002. Its
//                               time is measured inside the peer (the median of 5 runs, interpreter start and
//                               file reading not counted); counter remap_ms is remap alone with the maps built
//                               beforehand. OpenCV's undistort map is its forward polynomial, no iteration: the
//                               work of our Distort, not of our Undistort.
// Counters: pixels/s (of the 3840 x 2160 frame; the label gives the output's window), threads (the worker pool's, or
// OpenCV's).
#include <cmath>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/core/Parallel.h"
#include "host/flow/Engine.h"
#include "host/flow/Parameter.h"

namespace Orvane::Bench {
namespace {

/// The anamorphic model's realistic terms; the radial row's terms are the peer's k1, k2 on a filmback of the
/// frame's aspect, the very map OpenCV builds (tests/operators/warp/LensDistortPeerTest.cpp checks that).
const std::vector<std::pair<const char *, double>> kAnamorphic = {{"DE4AnamorphicStandardDegree4.Cx02Degree2", -0.03},
                                                                  {"DE4AnamorphicStandardDegree4.Cy02Degree2", -0.02},
                                                                  {"DE4AnamorphicStandardDegree4.Cx22Degree2", 0.004},
                                                                  {"DE4AnamorphicStandardDegree4.Cx04Degree4", 0.002},
                                                                  {"DE4AnamorphicStandardDegree4.Cy04Degree4", 0.001}};
const std::vector<std::pair<const char *, double>> kRadial = {
    {"DE4RadialStandardDegree4.DistortionDegree2", -0.03},
    {"DE4RadialStandardDegree4.QuarticDistortionDegree4", 0.002},
    {"ApertureWidth", 1.6},
    {"ApertureHeight", 0.9}};
constexpr double kK1 = -0.03, kK2 = 0.002;

void BM_LensDistort(benchmark::State &state, int mode, const char *model) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    const bool radial = std::string(model) == "DE4RadialStandardDegree4";
    auto numbers = radial ? kRadial : kAnamorphic;
    numbers.push_back({"Mode", mode});
    numbers.push_back({"Supersampling", state.range(0) == 2 ? 1 : 0});
    Operator *lens = AddToolOnFrame(state, doc, "LensDistort", numbers);
    if (!lens) return;
    lens->FindInput("Model")->SetValue(MakeRef<IDValue>(OvID(model)));
    // The output's data window (the mapped frame, Clipping Mode Domain) in the label: pixels/s counts the frame's.
    EvalOptions options;
    options.useCache = false;
    if (const auto *out = dynamic_cast<const Image *>(Evaluate(lens->FindMainOutput(), 0.0, options).Get())) {
        const ImgRectI dw = out->DataWindow();
        state.SetLabel("window " + std::to_string(dw.Width()) + "x" + std::to_string(dw.Height()));
    }
    RenderLoop(state, lens);
    state.counters["threads"] = WorkerCount();
}
BENCHMARK_CAPTURE(BM_LensDistort, Undistort, 1, "DE4AnamorphicStandardDegree4")
    ->Name("LensDistort/Undistort")
    ->Arg(1)
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_LensDistort, Distort, 0, "DE4AnamorphicStandardDegree4")
    ->Name("LensDistort/Distort")
    ->Arg(1)
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_LensDistort, DistortRadial, 0, "DE4RadialStandardDegree4")
    ->Name("LensDistort/DistortRadial")
    ->Arg(1)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

/// The frame as the peer reads it: RGBA float32, top row first. Empty when it cannot be written.
std::string RawFrame() {
    const std::string path = PeerOutput(".raw");
    std::ofstream f(path, std::ios::binary);
    const Image &frame = *UhdFrame();
    for (int y = kHeight - 1; y >= 0 && f; --y)
        f.write(reinterpret_cast<const char *>(frame.Row<float>(y)), std::streamsize(sizeof(float)) * 4 * kWidth);
    return f ? path : "";
}

void BM_LensDistortOpenCV(benchmark::State &state) {
    const char *python = "/usr/bin/python3"; // the interpreter Debian's python3-opencv installs into
    std::string out;
    if (CapturePeer(std::string(python) + " -c 'import cv2'", out) != 0) {
        state.SkipWithError("peer skipped: OpenCV's Python module is missing (python3-opencv)");
        return;
    }
    const std::string raw = RawFrame();
    if (raw.empty()) {
        state.SkipWithError("peer skipped: the frame could not be written for it");
        return;
    }
    // The radial terms over half the frame's diagonal, centred (OpenCV's pixel centres lie on whole numbers).
    const double f = 0.5 * std::hypot(kWidth, kHeight);
    std::ostringstream cmd;
    cmd.precision(17);
    cmd << python << " " << ORVANE_SOURCE_DIR << "/bench/peers/opencv_lens_remap.py time " << raw << " " << kWidth
        << " " << kHeight << " " << f << " " << f << " " << 0.5 * kWidth - 0.5 << " " << 0.5 * kHeight - 0.5 << " "
        << kK1 << " " << kK2 << " 5";
    for (auto _ : state) {
        if (CapturePeer(cmd.str(), out) != 0) {
            state.SkipWithError(("peer failed: " + out.substr(0, 200)).c_str());
            return;
        }
        std::istringstream words(out);
        std::string word;
        double both = -1, remapOnly = -1, threads = -1;
        while (words >> word) {
            if (word == "map_and_remap")
                words >> both;
            else if (word == "remap")
                words >> remapOnly;
            else if (word == "threads")
                words >> threads;
        }
        if (both < 0 || remapOnly < 0) {
            state.SkipWithError(("peer gave no times: " + out.substr(0, 200)).c_str());
            return;
        }
        state.SetIterationTime(both);
        state.counters["remap_ms"] = 1e3 * remapOnly;
        state.counters["threads"] = threads;
    }
    ReportPixels(state);
}
BENCHMARK(BM_LensDistortOpenCV)
    ->Name("LensDistort/OpenCV")
    ->UseManualTime()
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
