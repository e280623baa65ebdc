#pragma once
// Steps that most image tools share in Process, kept in one place:
//
//  * OutputDataWindow: the output's data window by the clipping mode
//      ClippingMode_Frame   the input's image rectangle
//      ClippingMode_Domain  the input's domain of definition
//      ClippingMode_None    the domain cut to the input image's data window
//    then cut to the request's region of interest when there is one.
//  * SplitRow: the three spans of an output row over an input: left of the
//    input's data window and right of it (both the canvas colour's), and the
//    middle, which reads pixels; all clipped to the output's window.
//
// Thread safety: pure functions.
#include "host/core/OvID.h"
#include "host/image/Rect.h"

namespace Orvane {

class Image;
class Input;
class Request;

ORVANE_API ImgRectI OutputDataWindow(const Request *req, const Input *in, const Image *img, OvID clippingMode);

struct RowSpans {
    int x0;        ///< start of the output row
    int midStart;  ///< first pixel read from the input
    int midEnd;    ///< one past the last pixel read
    int x1;        ///< end of the output row
    bool hasInput; ///< false: the whole row is canvas
};

/// Spans of row y of `out` over the input data window `in`.
ORVANE_API RowSpans SplitRow(const ImgRectI &out, const ImgRectI &in, int y);

} // namespace Orvane
