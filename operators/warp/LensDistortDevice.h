#pragma once
// The device path of Lens Distort's Distort mode: the "LensDistort" kernel of
// the common library reads the source at the model's direct function for
// every sample of every output pixel. It takes the radial model with
// decentering and cylindric bending and the two anamorphic models; the
// others (and Undistort, which iterates) stay on the rows.
//
// Thread safety: runs on the request's render thread; the model is only read.
#include "operators/warp/LensDistort.h"

namespace Orvane {

class Image;
class Request;

namespace lensdistort {

/// True when the kernel has `model`'s chain.
bool DeviceTakes(const Model &model);

/// Renders Distort (`s.mode` 0) of `src` into `dst`'s data window on the
/// request's device and hands `dst` the device image. False, with the reason
/// in the task's device log, when the device cannot: the caller runs the rows.
bool DistortOnDevice(Request *req, const LensDistort::Setup &s, const Image &src, Image &dst);

} // namespace lensdistort
} // namespace Orvane
