#pragma once
// NewImageTagList: makes an image for a request.
//
//   ImgLikeImage   take size, aspect, depth, field layout and attributes from an image
//   ImgDocument    take the document's default frame format when no image is given
//   ImgWidth, ImgHeight, ImgDepth, ImgXScale, ImgYScale   set them directly (win over the like-image)
//   ImgDataWindow  ImgRectI *: the data window (default: the image rectangle)
//   ImgValidWindow ImgRectI * or null: the part to be filled (default: the data window)
//   ImgNoData      make the image without pixels (pre-calculation)
//   ImgFullWidth .. ImgFieldOffset, ImgProxyScale, ImgQuickMode   attributes to record
//   ImgCanvasColor FltPixel *: the canvas colour (default: clear)
//   ImgAbortFlag   const std::atomic<bool> *: the render's abort flag
//
// Returns null for an impossible format (size or depth out of range).
//
// Thread safety: may be called from any thread.
#include "host/core/TagList.h"
#include "host/image/Image.h"

namespace Orvane {

/// Largest width or height an image may have.
constexpr int MaxImageSide = 1 << 17;

ORVANE_API Ref<Image> NewImageTagList(const TagList &tags);

} // namespace Orvane
