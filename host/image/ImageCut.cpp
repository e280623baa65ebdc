// Image::CopyOfImageTagList: a copy of an image with other windows (a cut, or
// a larger window filled with the canvas colour), made by NewImageTagList
// with this image as the like-image. Unless the tags say otherwise the copy
// keeps this image's data window, valid window, canvas colour and no-data
// state; its pixels come from ImageCopy (converted when ImgDepth differs),
// and auxiliary planes are copied where the windows overlap (zero elsewhere).
#include <algorithm>
#include <cstring>

#include "host/core/Tags.h"
#include "host/image/NewImage.h"

namespace Orvane {

Ref<Image> Image::CopyOfImageTagList(const TagList &tags) const {
    TagList all = tags;
    const auto *given = tags.GetPtrAs<const ImgRectI>(ImgDataWindow);
    const ImgRectI dw = given ? *given : dataWindow_;
    all.Set({ImgLikeImage, this});
    all.Set({ImgDataWindow, &dw});
    const ImgRectI vw = validWindow_ & dw;
    if (!tags.Has(ImgValidWindow)) all.Set({ImgValidWindow, &vw});
    if (!tags.Has(ImgCanvasColor)) all.Set({ImgCanvasColor, &canvas_});
    if (!tags.Has(ImgNoData)) all.Set({ImgNoData, noData_});
    Ref<Image> out = NewImageTagList(all);
    if (!out) return nullptr;
    out->Metadata() = metadata_;
    out->SetIsOpaque(opaque_);
    if (out->IsNoData() || dw.IsNull()) return out;
    for (const AuxPlane &plane : aux_) out->AddAuxChannel(plane.kind);
    if (!out->AllocScanLineData()) return nullptr;
    out->ImageCopy(this);
    const ImgRectI both = dw & dataWindow_;
    if (!both.IsNull() && HasScanLineData())
        for (const AuxPlane &plane : aux_)
            for (int y = both.y0; y < both.y1; ++y) {
                const float *from = AuxRow(plane.kind, y);
                float *to = out->AuxRow(plane.kind, y);
                if (from && to)
                    std::memcpy(to + (both.x0 - dw.x0), from + (both.x0 - dataWindow_.x0),
                                sizeof(float) * both.Width());
            }
    return out;
}

} // namespace Orvane
