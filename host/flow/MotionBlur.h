#pragma once
// Motion blur, one of the common controls: a tool's image output averaged
// over the time its shutter is open. The engine asks MotionBlurOf before it
// walks a request; when the tool's MotionBlur is on, the result is the mean
// of the same output rendered at the shutter's sample times.
//
// Sample times, for a request at frame t:
//   S   = ShutterAngle / 360                          open time, in frames
//   u_i = ((i + 0.5) / N - 0.5) x SampleSpread        i = 0 .. N - 1, N = Quality
//   t_i = t + S x (CenterBias / 2 + u_i)
// so with SampleSpread 1 the samples sit at the middles of N equal slices of
// the open interval [t + S (CenterBias - 1) / 2, t + S (CenterBias + 1) / 2]:
// CenterBias 0 centres it on t, -1 closes the shutter at t, 1 opens it at t.
// SampleSpread below 1 draws the samples towards the interval's middle.
// Quality 1 or a closed shutter (angle 0) renders the frame itself.
//
// The mean is taken per channel over the premultiplied pixels, in float,
// and stored in the depth of the output; a pending transform is made into
// pixels first. The output's data window is the union of the samples' (cut
// to the request's region), its canvas colour the mean of theirs. In
// pre-calculation the samples' windows are joined the same way.
//
// Sample requests carry ReqFlagMotionSample, which travels up the flow with
// them: no tool above a sample blurs again (the outermost shutter decides,
// and the cost stays N renders rather than N per blurring tool), and their
// results are cached apart from ordinary results at the same time.
//
// Thread safety: called on a render thread for one request; the averaging
// runs rows on the worker pool.
#include <optional>
#include <vector>

#include "host/flow/Engine.h"

namespace Orvane {

/// Request flag of the renders at a shutter's sample times.
constexpr uint32_t ReqFlagMotionSample = 1u << 20;

struct MotionBlurSettings {
    int quality = 2;           ///< number of samples
    double shutterAngle = 180; ///< degrees; 360 is a whole frame open
    double centerBias = 0;     ///< -1 .. 1: where the open interval sits around the frame
    double sampleSpread = 1;   ///< 0 .. 1: how far the samples reach into the interval
};

/// The sample times for a request at `time` (formula above).
ORVANE_API std::vector<double> MotionBlurSampleTimes(double time, const MotionBlurSettings &settings);

/// The motion-blurred value of `out` at `time` when its tool has motion blur
/// on for this request (null when a sample failed or the render was
/// aborted); absent when the request takes the ordinary way: motion blur
/// off, a single sample at the frame itself, a sample request, an output
/// that is no image, or a tool without the controls.
std::optional<Ref<Parameter>> MotionBlurOf(Output *out, double time, const EvalOptions &options);

} // namespace Orvane
