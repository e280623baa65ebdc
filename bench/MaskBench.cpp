// The polygon masks at UHD, one-channel float, through the engine with the
// cache off (the mask's own size controls set to 3840x2160):
//   Poly200       a hard closed Bezier line of 200 smooth points, a wavy ring
//                 0.3 of the width across its radius
//   Poly200Band   the same with an outer line 0.05 of the width further out:
//                 the inner fill and the soft band between the two (8 samples
//                 a pixel side, written directly)
//   Poly200BandHollow  the band of a hollow line (32 samples, band images)
//   MultiPoly10   a MultiPoly of 10 layers, each a hard 50-point ring 0.08 of
//                 the width across its radius, along the frame's middle, all
//                 merged (every other one subtracted over its neighbours)
// Compare with BM_CopyFloorAFlt32 (CopyBench.cpp), the floor a hard fill is
// held to (3x), and with BM_MaskBlurFastGaussian (PrimitiveMaskBench.cpp), the
// blur of a soft edge of the same size, which the band is held to.
#include <cmath>
#include <numbers>
#include <string>

#include "bench/BenchSupport.h"
#include "host/flow/Engine.h"
#include "host/image/Image.h"
#include "host/shape/PolyLine.h"

namespace Orvane::Bench {
namespace {

/// A closed smooth line of `n` points about the middle, radius `r` (widths)
/// with a wave of 1/10 of it, handles along the tangent.
Ref<PolyLine> WavyRing(int n, double r) {
    auto line = MakeRef<PolyLine>();
    line->closed = true;
    const double aspect = double(kHeight) / kWidth;
    for (int i = 0; i < n; ++i) {
        const double a = 2 * std::numbers::pi * i / n, rad = r * (1 + 0.1 * std::sin(7 * a));
        const double step = 2 * std::numbers::pi * rad / n / 3; // a third of the chord, along the tangent
        PolyPoint p;
        p.x = rad * std::cos(a), p.y = rad * std::sin(a) / aspect; // Y in heights
        p.rightX = -step * std::sin(a), p.rightY = step * std::cos(a) / aspect;
        p.leftX = -p.rightX, p.leftY = -p.rightY;
        line->points.push_back(p);
    }
    return line;
}

/// A mask tool of class `cls` in `doc`, its size set to UHD; null (the run skipped) when it is not registered.
Operator *UHDMask(benchmark::State &state, OrvaneDoc &doc, const char *cls) {
    if (!LoadLibrary(state)) return nullptr;
    Operator *mask = doc.AddTool(OvID(cls));
    if (!mask) {
        state.SkipWithError((std::string("the ") + cls + " class is not registered").c_str());
        return nullptr;
    }
    mask->FindInput("MaskWidth")->SetValue(MakeRef<Number>(kWidth));
    mask->FindInput("MaskHeight")->SetValue(MakeRef<Number>(kHeight));
    return mask;
}

/// Times the mask's frame 0 with the cache off; the last result, its window counted.
Ref<Image> TimeMask(benchmark::State &state, Operator *mask) {
    EvalOptions options;
    options.useCache = false;
    for (auto _ : state) benchmark::DoNotOptimize(Evaluate(mask->FindMainOutput(), 0.0, options).Get());
    ReportPixels(state);
    Ref<Image> img(dynamic_cast<Image *>(Evaluate(mask->FindMainOutput(), 0.0, options).Get()));
    if (img) state.counters["window"] = double(img->DataWindow().Width()) * img->DataWindow().Height();
    return img;
}

void RunPolyMask(benchmark::State &state, bool band, bool hollow) {
    OrvaneDoc doc;
    Operator *mask = UHDMask(state, doc, "PolylineMask");
    if (!mask) return;
    mask->FindInput("Polyline")->SetValue(WavyRing(200, 0.3));
    if (band) mask->FindInput("Polyline2")->SetValue(WavyRing(200, 0.35));
    if (hollow) mask->FindInput("Solid")->SetValue(MakeRef<Number>(0));
    // What was drawn: the mask's window, its value inside the inner line and half way out to the outer one.
    if (const Ref<Image> img = TimeMask(state, mask)) {
        state.counters["inside"] = img->GetFlt(int(kWidth * 0.7), kHeight / 2).A;
        state.counters["band"] = img->GetFlt(int(kWidth * (0.5 + 0.325)), kHeight / 2).A;
    }
}

void BM_Mask_Poly200(benchmark::State &state) { RunPolyMask(state, false, false); }
BENCHMARK(BM_Mask_Poly200)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Mask_Poly200Band(benchmark::State &state) { RunPolyMask(state, true, false); }
BENCHMARK(BM_Mask_Poly200Band)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Mask_Poly200BandHollow(benchmark::State &state) { RunPolyMask(state, true, true); }
BENCHMARK(BM_Mask_Poly200BandHollow)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_Mask_MultiPoly10(benchmark::State &state) {
    OrvaneDoc doc;
    Operator *mask = UHDMask(state, doc, "MultiPolyMask");
    if (!mask) return;
    for (int i = 1; i <= 10; ++i) {
        mask->FindInput("AddPolygon")->SetValue(MakeRef<Number>(1));
        auto in = [&](const char *id) { return mask->FindInput(("PolyMask" + std::to_string(i) + "." + id).c_str()); };
        in("Polyline")->SetValue(WavyRing(50, 0.08));
        in("Center")->SetValue(MakeRef<Point>(0.05 + 0.09 * i, 0.5));
        if (i % 2 == 0) in("PaintMode")->SetValue(MakeRef<IDValue>(OvID("Subtract")));
    }
    if (const Ref<Image> img = TimeMask(state, mask))
        state.counters["first"] = img->GetFlt(int(kWidth * 0.14), kHeight / 2).A;
}
BENCHMARK(BM_Mask_MultiPoly10)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
