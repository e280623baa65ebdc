#pragma once
// A synthetic sequence for object mattes: a textured ellipse in warm colours with a soft edge, moving and slowly
// turning over a textured background in cool colours, with its true mask, and strokes marking it.
//
// Geometry scales with the frame (a 160 x 120 frame is the reference size): at frame f, with p = 2 pi f / kBlobFrames,
// the ellipse's centre is at (0.5 + 0.2 sin p, 0.4 + 0.1 sin 2p) of the frame (one loop over the sequence, up to
// 6.7 and 5 pixels a frame at 160 x 120, so that the carried mask is wrong by more than a few pixels unless it is
// moved with the picture), its semi-axes are 0.19 of the width and 0.15 of the height, and it turns 0.03 radians a
// frame from 0.3. It is off the frame's centre at frame 0, so that rows read upside down miss it. Its texture is
// fixed to the object
// (it turns with it); the background's to the frame. The edge ramps from opaque to clear over 1.5 pixels at the
// reference size; the true mask is the ellipse itself (where the coverage reaches one half). kBlobFrames frames keep
// the ellipse inside the frame. Colours are linear, alpha 1 (premultiplied trivially) unless `alpha` scales them.
//
// Thread safety: the functions share no state.
#include <memory>
#include <string>
#include <vector>

#include "host/image/Image.h"

namespace Orvane::Test {

constexpr int kBlobFrames = 30;

/// Frame `frame` of a `width` x `height` sequence over `window` (default: the frame), of `depth`, every channel
/// multiplied by `alpha` (a premultiplied picture of that opacity).
Ref<Image> MakeBlobFrame(int width, int height, int frame, int depth = DepthRGBAFlt32, const ImgRectI *window = nullptr,
                         float alpha = 1.f);

/// Whether the pixel centred at (x, y) (rows from the bottom) lies inside the ellipse at `frame`.
bool InsideBlob(int width, int height, int frame, double x, double y);

/// Strokes a user would draw on `frame`, as x, y pairs with NaN pairs between strokes: positive ones along the
/// ellipse's long axis and across it, negative ones on a loop around it.
std::vector<float> BlobPositiveStrokes(int width, int height, int frame);
std::vector<float> BlobNegativeStrokes(int width, int height, int frame);

/// Intersection over union of a matte's alpha >= 0.5 with the true mask over the frame (1 when both are empty).
double BlobIoU(const Image &matte, int width, int height, int frame);

/// One call of the kernel "GetObjectMask" as the tool makes it: a KROMComputeNode on host buffers, the frame as
/// "src", `carried` (null: a 1 x 1 dummy) as "cachePropMaskIn", the strokes, and new outputs over the frame's data
/// window (or `outWindow`): an RGBA float matte and a float mask to carry.
struct ObjectMaskRun {
    bool ok = false;
    std::string error;
    Ref<Image> matte, carry;
};
ObjectMaskRun RunObjectMask(const Image &frame, const Image *carried, std::shared_ptr<const void> block,
                            size_t blockSize, const std::vector<float> &pos, const std::vector<float> &neg,
                            const ImgRectI *outWindow = nullptr);

} // namespace Orvane::Test
