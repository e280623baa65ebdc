// The primitive masks at UHD, one-channel float, through the engine with the
// cache off (the mask's own size controls set to 3840x2160):
//   Ellipse          a hard ellipse half the frame wide
//   EllipseSoftEdge  the same with Soft Edge 0.05 (Fast Gaussian, the default)
//   RectangleBorder  a hollow rounded rectangle, a 0.02 border with round joins
// Compare with BM_CopyFloorAFlt32 (CopyBench.cpp) and with the Fast Gaussian blur of
// the same size on the mask alone (BM_MaskBlurFastGaussian below: the cost the
// soft edge is held to).
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/image/BlurFilters.h"
#include "host/image/NewImage.h"

namespace Orvane::Bench {
namespace {

void RunMask(benchmark::State &state, const char *cls, const std::vector<std::pair<const char *, double>> &numbers) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Operator *mask = doc.AddTool(OvID(cls));
    if (!mask) {
        state.SkipWithError("the mask class is not registered");
        return;
    }
    mask->FindInput("MaskWidth")->SetValue(MakeRef<Number>(kWidth));
    mask->FindInput("MaskHeight")->SetValue(MakeRef<Number>(kHeight));
    for (const auto &[id, value] : numbers) mask->FindInput(id)->SetValue(MakeRef<Number>(value));
    EvalOptions options;
    options.useCache = false;
    for (auto _ : state) benchmark::DoNotOptimize(Evaluate(mask->FindMainOutput(), 0.0, options).Get());
    ReportPixels(state);
}

void BM_Mask_Ellipse(benchmark::State &state) { RunMask(state, "EllipseMask", {{"Width", 0.5}, {"Height", 0.5}}); }
BENCHMARK(BM_Mask_Ellipse)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Mask_EllipseSoftEdge(benchmark::State &state) {
    RunMask(state, "EllipseMask", {{"Width", 0.5}, {"Height", 0.5}, {"SoftEdge", 0.05}});
}
BENCHMARK(BM_Mask_EllipseSoftEdge)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Mask_RectangleBorder(benchmark::State &state) {
    RunMask(state, "RectangleMask",
            {{"Width", 0.6},
             {"Height", 0.4},
             {"CornerRadius", 0.3},
             {"BorderWidth", 0.02},
             {"Solid", 0},
             {"JoinStyle", 1}});
}
BENCHMARK(BM_Mask_RectangleBorder)->UseRealTime()->Unit(benchmark::kMillisecond);

/// The blur the soft edge above runs, on a hard half-frame ellipse's window alone.
void BM_MaskBlurFastGaussian(benchmark::State &state) {
    Ref<Image> mask = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthAFlt32}});
    if (!mask || !mask->AllocScanLineData()) return state.SkipWithError("no memory");
    mask->FillWithin({1, 1, 1, 1},
                     ImgRectI(kWidth / 4, kHeight / 2 - kWidth / 4, 3 * kWidth / 4, kHeight / 2 + kWidth / 4));
    for (auto _ : state)
        benchmark::DoNotOptimize(
            mask->BlurOfImageTagList(
                    {{BlurFilterType, BlurFastGaussian}, {BlurPasses, 4}, {BlurXSize, 0.05}, {BlurYSize, 0.05}})
                .Get());
    ReportPixels(state);
}
BENCHMARK(BM_MaskBlurFastGaussian)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
