#include "host/flow/ToolFrame.h"

#include <algorithm>

#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"

namespace Orvane {

ImgRectI OutputDataWindow(const Request *req, const Input *in, const Image *img, OvID clippingMode) {
    const AutoImageRoI roi(req);
    const AutoImageDoD dod(req, in);
    const ImgRectI domain = dod ? dod->rect : img->DataWindow();
    ImgRectI dw;
    if (clippingMode == ClippingMode_Frame)
        dw = img->Frame();
    else if (clippingMode == ClippingMode_Domain)
        dw = domain;
    else
        dw = domain & img->DataWindow();
    if (roi) dw &= roi->rect;
    return dw;
}

RowSpans SplitRow(const ImgRectI &out, const ImgRectI &in, int y) {
    RowSpans s{out.x0, out.x0, out.x0, out.x1, false};
    if (y < in.y0 || y >= in.y1 || in.x1 <= out.x0 || in.x0 >= out.x1) {
        s.midStart = s.midEnd = out.x1;
        return s;
    }
    s.midStart = std::max(out.x0, in.x0);
    s.midEnd = std::min(out.x1, in.x1);
    s.hasInput = s.midEnd > s.midStart;
    return s;
}

} // namespace Orvane
