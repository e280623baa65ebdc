#pragma once
// The image-format controls that tools making images from nothing share
// (generators, masks): Width, Height, Pixel Aspect and Depth on a page of the
// tool, with the document's frame format as defaults, and reading them back
// for a request. The Depth list is Default, int8, int16, float16, float32;
// the caller maps the choice to RGBA or single-channel depths.
//
// Thread safety: Add runs in a tool's construction (main thread); Read only
// reads the request.
#include "host/flow/OrvaneDoc.h"

namespace Orvane {

class Input;
class Operator;
class Request;

struct ImageFormatInputs {
    Input *width = nullptr, *height = nullptr, *aspect = nullptr, *depth = nullptr;

    /// Adds the size (Width, Height), aspect (PixelAspect) and depth (Depth)
    /// controls that are asked for, in that order, on page `page`. `sizeIds`
    /// replaces the IDs of the two size controls (masks: their shapes have a
    /// Width and Height of their own); the labels stay "Width" and "Height".
    void Add(Operator *op, int page, const FrameFormat &ff, bool size, bool pixelAspect, bool depthList,
             const char *const sizeIds[2] = nullptr);

    struct Values {
        int width = 0, height = 0;
        double aspectX = 1.0, aspectY = 1.0;
        int depthChoice = 0; ///< 0 Default, 1 int8, 2 int16, 3 float16, 4 float32
    };
    /// The values a request holds; the frame format where a control is absent.
    Values Read(const Request *req, const FrameFormat &ff) const;
};

} // namespace Orvane
