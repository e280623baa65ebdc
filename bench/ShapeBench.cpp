// Masks from shapes at UHD into a one-channel float32 frame (its rows already
// allocated, as a mask tool's image has them by then): a filled ellipse, a
// closed polygon of 200 Bezier points (flattened on the way in), and the
// stroke of the ellipse (outline and scan conversion). BM_CopyFloorAFlt32
// (CopyBench.cpp) is the floor to read them against.
#include <cmath>
#include <numbers>

#include "bench/BenchSupport.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/shape/Shape.h"
#include "host/shape/ShapeRasterizer.h"

namespace Orvane::Bench {
namespace {

constexpr double kAspect = double(kHeight) / kWidth;

Ref<Image> MaskFrame() {
    Ref<Image> mask = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthAFlt32}});
    mask->AllocScanLineData();
    return mask;
}

/// The ellipse as the ellipse mask builds it: points every quarter pixel of its radius.
Ref<Shape> Ellipse() {
    const double hw = 0.3, hh = 0.2;
    const int n = static_cast<int>(4 * std::hypot(hw * kWidth, hh * kWidth));
    Ref<Shape> s = MakeRef<Shape>();
    for (int i = 0; i < n; ++i) {
        const double a = 2 * std::numbers::pi * i / n;
        const double x = 0.5 + hw * std::cos(a), y = kAspect / 2 + hh * std::sin(a);
        i == 0 ? s->MoveTo(x, y) : s->LineTo(x, y);
    }
    s->Close();
    return s;
}

/// A wavy closed curve of 200 Bezier points with smooth handles.
Ref<Shape> BezierPolygon() {
    constexpr int n = 200;
    auto point = [](int i, double &x, double &y, double &tx, double &ty) {
        const double a = 2 * std::numbers::pi * i / n, r = 0.22 + 0.04 * std::sin(7 * a);
        const double dr = 0.28 * std::cos(7 * a); // d r / d a
        x = 0.5 + r * std::cos(a);
        y = kAspect / 2 + r * std::sin(a);
        const double step = 2 * std::numbers::pi / n / 3;
        tx = (dr * std::cos(a) - r * std::sin(a)) * step;
        ty = (dr * std::sin(a) + r * std::cos(a)) * step;
    };
    Ref<Shape> s = MakeRef<Shape>();
    double x, y, tx, ty;
    point(0, x, y, tx, ty);
    s->MoveTo(x, y);
    for (int i = 1; i <= n; ++i) {
        double x1, y1, tx1, ty1;
        point(i % n, x1, y1, tx1, ty1);
        s->BezierTo(x + tx, y + ty, x1 - tx1, y1 - ty1, x1, y1);
        x = x1, y = y1, tx = tx1, ty = ty1;
    }
    s->Close();
    return s;
}

void RasterizeLoop(benchmark::State &state, const Shape &shape) {
    Ref<Image> mask = MaskFrame();
    const ShapeRasterizerInputs ras(nullptr);
    for (auto _ : state) {
        if (!ras.Rasterize(nullptr, shape, mask.Get(), false, ShapeWindingNonZero)) state.SkipWithError("failed");
        benchmark::DoNotOptimize(mask.Get());
    }
    ReportPixels(state);
}

void BM_ShapeFilledEllipse(benchmark::State &state) { RasterizeLoop(state, *Ellipse()); }
BENCHMARK(BM_ShapeFilledEllipse)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ShapeBezierPolygon200(benchmark::State &state) { RasterizeLoop(state, *BezierPolygon()); }
BENCHMARK(BM_ShapeBezierPolygon200)->UseRealTime()->Unit(benchmark::kMillisecond);

/// The ellipse's stroke, 20 pixels wide, round joins, at the masks' tolerance of 2/W: outline and scan conversion.
void BM_ShapeStrokedEllipse(benchmark::State &state) {
    const Ref<Shape> ellipse = Ellipse();
    Ref<Image> mask = MaskFrame();
    const ShapeRasterizerInputs ras(nullptr);
    const TagList tags{{ShapeJoin, ShapeJoinRound}, {ShapeTolerance, 2.0 / kWidth}};
    for (auto _ : state) {
        const Ref<Shape> stroke = ellipse->OutlineOfShapeTagList(20.0 / kWidth, tags);
        if (!ras.Rasterize(nullptr, *stroke, mask.Get(), false, ShapeWindingNonZero)) state.SkipWithError("failed");
        benchmark::DoNotOptimize(mask.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_ShapeStrokedEllipse)->UseRealTime()->Unit(benchmark::kMillisecond);

/// The outline alone, to tell its share of the stroke.
void BM_ShapeOutlineOnly(benchmark::State &state) {
    const Ref<Shape> ellipse = Ellipse();
    const TagList tags{{ShapeJoin, ShapeJoinRound}, {ShapeTolerance, 2.0 / kWidth}};
    for (auto _ : state) benchmark::DoNotOptimize(ellipse->OutlineOfShapeTagList(20.0 / kWidth, tags).Get());
}
BENCHMARK(BM_ShapeOutlineOnly)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
