#include "host/flow/PointRows.h"

#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"

namespace Orvane {

Ref<Image> NewPointOutput(Request *req, const Input *in, const Image *src, OvID clippingMode) {
    const AutoImageRoI roi(req);
    const ImgRectI dataWindow = OutputDataWindow(req, in, src, clippingMode);
    const ImgRectI validWindow = roi ? roi->rect : dataWindow;
    return NewImageTagList({{ImgLikeImage, src},
                            {ImgDataWindow, &dataWindow},
                            {ImgValidWindow, &validWindow},
                            {ImgNoData, req->IsPreCalc()},
                            {ImgForRequest, 1},
                            {ImgTakeWindows, 1}});
}

} // namespace Orvane
