#include "host/image/NewImage.h"

#include <atomic>

#include "host/core/Tags.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane {

Ref<Image> NewImageTagList(const TagList &tags) {
    const auto *like = tags.GetPtrAs<const Image>(ImgLikeImage);
    const auto *doc = tags.GetPtrAs<const OrvaneDoc>(ImgDocument);

    int width = 0, height = 0, depth = DepthRGBAFlt32;
    double xScale = 1.0, yScale = 1.0;
    if (like) {
        width = like->Width(), height = like->Height(), depth = like->Depth();
        xScale = like->XScale(), yScale = like->YScale();
    } else if (doc) {
        const FrameFormat ff = doc->GetFrameFormat();
        width = ff.width, height = ff.height, depth = ff.depth;
        xScale = ff.aspectX, yScale = ff.aspectY;
    }
    // Checked before narrowing to int, so that a 64-bit value cannot wrap into range.
    const long long w = tags.GetLong(ImgWidth, width), h = tags.GetLong(ImgHeight, height);
    const long long d = tags.GetLong(ImgDepth, depth);
    xScale = tags.GetDouble(ImgXScale, xScale);
    yScale = tags.GetDouble(ImgYScale, yScale);
    if (w < 1 || h < 1 || w > MaxImageSide || h > MaxImageSide || d < DepthAInt8 || d > DepthRGBAFlt32) return nullptr;
    width = static_cast<int>(w), height = static_cast<int>(h), depth = static_cast<int>(d);
    if (!(xScale > 0.0) || !(yScale > 0.0)) return nullptr;

    auto img = MakeRef<Image>(width, height, depth);
    img->SetScale(xScale, yScale);
    if (like) img->SetAttrsTagList(like->Attrs());

    if (const auto *dw = tags.GetPtrAs<const ImgRectI>(ImgDataWindow)) img->SetDataWindow(*dw);
    if (tags.Has(ImgValidWindow)) {
        const auto *vw = tags.GetPtrAs<const ImgRectI>(ImgValidWindow);
        img->SetValidWindow(vw ? *vw : img->DataWindow());
    } else {
        img->SetValidWindow(img->DataWindow());
    }
    img->SetNoData(tags.GetBool(ImgNoData));
    if (const auto *canvas = tags.GetPtrAs<const FltPixel>(ImgCanvasColor)) img->SetCanvasColor(*canvas);
    if (const auto *abort = tags.GetPtrAs<const std::atomic<bool>>(ImgAbortFlag))
        img->SetAbortFlag(abort);
    else if (like)
        img->SetAbortFlag(like->AbortFlag());

    TagList attrs;
    for (Tag t : {ImgFullWidth, ImgFullHeight, ImgField, ImgProxyScale, ImgQuickMode})
        if (tags.Has(t)) attrs.Set({t, tags.GetLong(t)});
    for (Tag t : {ImgFullXScale, ImgFullYScale, ImgFieldOffset})
        if (tags.Has(t)) attrs.Set({t, tags.GetDouble(t)});
    if (!attrs.Empty()) img->SetAttrsTagList(attrs);
    return img;
}

} // namespace Orvane
