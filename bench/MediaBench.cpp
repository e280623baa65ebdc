// Files in and out: writing and reading a UHD 16-bit PNG through a clip, and
// the render rate of a Loader -> Brightness/Contrast -> Saver flow on HD
// half-float OpenEXR frames (what one farm frame costs, disk included).
#include <filesystem>
#include <unistd.h>

#include "bench/BenchSupport.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/InputValue.h"
#include "host/flow/RenderTask.h"
#include "host/image/NewImage.h"
#include "host/media/Clip.h"

namespace Orvane::Bench {
namespace {

std::filesystem::path BenchFolder(const char *name) {
    const auto dir =
        std::filesystem::temp_directory_path() / ("orvane-bench-" + std::string(name) + "-" + std::to_string(getpid()));
    std::filesystem::create_directories(dir);
    return dir;
}

/// The UHD frame at another depth.
Ref<Image> UhdAt(int depth) {
    Ref<Image> img = NewImageTagList({{ImgLikeImage, UhdFrame().Get()}, {ImgDepth, depth}});
    img->AllocScanLineData();
    img->ImageCopy(UhdFrame().Get());
    return img;
}

void BM_Png16Write(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    const auto dir = BenchFolder("png");
    Ref<Image> frame = UhdAt(DepthRGBAInt16);
    Clip clip((dir / "frame.png").string());
    std::string error;
    for (auto _ : state)
        if (!clip.PutFrameTagList(0, frame.Get(), {}, error)) state.SkipWithError(error.c_str());
    ReportPixels(state);
    std::filesystem::remove_all(dir);
}
BENCHMARK(BM_Png16Write)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Png16Read(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    const auto dir = BenchFolder("png");
    Clip clip((dir / "frame.png").string());
    std::string error;
    clip.PutFrameTagList(0, UhdAt(DepthRGBAInt16).Get(), {}, error);
    for (auto _ : state) {
        Ref<Image> img = clip.GetFrameTagList(0, {}, error);
        if (!img) state.SkipWithError(error.c_str());
        benchmark::DoNotOptimize(img.Get());
    }
    ReportPixels(state);
    std::filesystem::remove_all(dir);
}
BENCHMARK(BM_Png16Read)->UseRealTime()->Unit(benchmark::kMillisecond);

/// Frames per second of reading, grading and writing HD EXR frames.
void BM_RenderLoaderGradeSaver(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    const auto dir = BenchFolder("render");
    Ref<Image> hd = NewImageTagList({{ImgWidth, 1920}, {ImgHeight, 1080}, {ImgDepth, DepthRGBAFlt16}});
    hd->AllocScanLineData();
    hd->Fill(FltPixel{0.18f, 0.3f, 0.5f, 1.0f});
    std::string error;
    for (int f = 0; f < 8; ++f) {
        Clip plate((dir / "plate.0000.exr").string());
        plate.SetStartFrame(f);
        if (!plate.PutFrameTagList(0, hd.Get(), {}, error)) {
            state.SkipWithError(error.c_str());
            return;
        }
    }
    OrvaneDoc doc;
    Operator *loader = doc.AddTool(OvID("Loader"), "Plate");
    Operator *grade = doc.AddTool(OvID("BrightnessContrast"), "Grade");
    Operator *saver = doc.AddTool(OvID("Saver"), "Out");
    ApplyInputValue(doc, loader->FindInput("Clip"), ScriptVal((dir / "plate.0000.exr").string()));
    ApplyInputValue(doc, grade->FindInput("Gain"), ScriptVal(1.2));
    grade->FindInput("Input")->ConnectTo(loader->FindMainOutput());
    ApplyInputValue(doc, saver->FindInput("Clip"), ScriptVal((dir / "out.####.exr").string()));
    saver->FindInput("Input")->ConnectTo(grade->FindMainOutput());
    RenderTask task;
    EvalOptions options;
    options.task = &task;
    options.useCache = false;
    int frame = 0;
    for (auto _ : state) {
        if (!Evaluate(saver->FindMainOutput(), frame++ % 8, options)) state.SkipWithError("the frame failed");
    }
    state.counters["fps"] = benchmark::Counter(static_cast<double>(state.iterations()), benchmark::Counter::kIsRate);
    std::filesystem::remove_all(dir);
}
BENCHMARK(BM_RenderLoaderGradeSaver)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
