// The lens models mapping every pixel of an HD frame (1920 x 1080 positions, normalised), as the Lens Distort
// tool will call them: the 4:3 filmback of the tests with the lens centre off the middle, realistic coefficients.
//
//   LensModel/Undistort/<model>         the direct function.
//   LensModel/DistortFromLeft/<model>   the inverse, each pixel starting from its left neighbour's answer (the
//                                       tool's row walk).
//   LensModel/DistortFromTable/<model>  the inverse from the start table (built once before timing).
// Counter rounds: the largest Newton round count seen.
#include <benchmark/benchmark.h>

#include "operators/warp/ldpk/Models.h"

namespace Orvane::Bench {
namespace {

constexpr int frame_w = 1920, frame_h = 1080;

std::unique_ptr<ldpk::ldp_builtin> make_model(int index) {
    auto model = std::move(ldpk::make_models()[index]);
    const char *names[] = {"tde4_focal_length_cm",         "tde4_filmback_width_cm",       "tde4_filmback_height_cm",
                           "tde4_lens_center_offset_x_cm", "tde4_lens_center_offset_y_cm", "tde4_pixel_aspect"};
    const double values[] = {3.5, 3.6, 2.7, 0.03, -0.02, 1.0};
    for (int i = 0; i < 6; ++i) model->setParameterValue(names[i], values[i]);
    // The first two parameters of every model are its main second-order terms.
    model->setParameterValue(model->getParameterName(0), -0.05);
    model->setParameterValue(model->getParameterName(1), index == 2 ? 1.1 : -0.04);
    if (model->getNumParameters() > 4) model->setParameterValue(model->getParameterName(4), 0.01);
    model->initializeParameters();
    return model;
}

void Run(benchmark::State &state, int mode) {
    auto model = make_model(static_cast<int>(state.range(0)));
    state.SetLabel(model->getModelName());
    double x1, y1;
    model->distort(0.5, 0.5, x1, y1); // builds the start table
    model->distortion().reset_counters();
    double sum = 0;
    for (auto _ : state) {
        for (int j = 0; j < frame_h; ++j) {
            const double y = (j + 0.5) / frame_h;
            double sx = 0.0, sy = y;
            for (int i = 0; i < frame_w; ++i) {
                const double x = (i + 0.5) / frame_w;
                if (mode == 0)
                    model->undistort(x, y, x1, y1);
                else if (mode == 1)
                    model->distort(x, y, sx, sy, x1, y1), sx = x1, sy = y1;
                else
                    model->distort(x, y, x1, y1);
                sum += x1 + y1;
            }
        }
    }
    benchmark::DoNotOptimize(sum);
    state.SetItemsProcessed(state.iterations() * frame_w * frame_h);
    state.counters["rounds"] = model->distortion().largest_iterations();
}

BENCHMARK_CAPTURE(Run, Undistort, 0)->Name("LensModel/Undistort")->DenseRange(0, 5)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Run, DistortFromLeft, 1)
    ->Name("LensModel/DistortFromLeft")
    ->DenseRange(0, 5)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Run, DistortFromTable, 2)
    ->Name("LensModel/DistortFromTable")
    ->DenseRange(0, 5)
    ->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
