// The channel steps of MatteSteps.h: blurring one channel in place over the
// host blur (docs/BLUR.md), and copying a channel between images.
#include <algorithm>

#include "host/core/Tags.h"
#include "host/image/BlurFilters.h"
#include "host/image/NewImage.h"
#include "host/matte/MatteRows.h"
#include "host/matte/MatteSteps.h"

namespace Orvane {
namespace matteblur {

using namespace matterows;

/// One channel of `img` as a float mask over its window, its canvas the
/// channel's; null when memory was refused or the copy abandoned.
Ref<Image> ChannelPlane(Request *req, const Image &img, int channel) {
    const ImgRectI dw = img.DataWindow();
    const float v = img.GetCanvasColorFltChan(channel);
    const FltPixel canvas{v, v, v, v};
    Ref<Image> plane = NewImageTagList(
        {{ImgLikeImage, &img}, {ImgDepth, DepthAFlt32}, {ImgDataWindow, &dw}, {ImgCanvasColor, &canvas}});
    if (!plane || !plane->AllocScanLineData()) return nullptr;
    plane->SetScale(img.XScale(), img.YScale());
    plane->SetAbortFlag(img.AbortFlag());
    return MatteCore_DoCopyChannel(req, &img, plane.Get(), channel, MatteAlpha) ? plane : nullptr;
}

bool BlurChannel(Request *req, Image *img, int channel, double size, int passes, int kind) {
    if (!img || channel < MatteRed || channel > MatteAlpha) return false;
    if (!(size > 0.0)) return true; // 0 (or less, or not a number) blurs nothing
    const int c = StoredChannel(*img, channel);
    const double normalised = size / 720.0; // the Blur tool's units
    TagList tags{{BlurFilterType, kind},
                 {BlurPasses, passes},
                 {BlurXSize, normalised},
                 {BlurYSize, normalised},
                 {WorkRequest, static_cast<const void *>(req)}};
    // A channel of a four-channel image is blurred as a mask of its own: the
    // blur then carries one value per pixel instead of four, with the same
    // arithmetic on it (docs/BLUR.md), and the result is copied back.
    if (!img->IsMask() && !img->IsNoData() && img->DataWindow().Width() > 0) {
        if (Ref<Image> plane = ChannelPlane(req, *img, c))
            return plane->BlurTagList(plane.Get(), tags) &&
                   MatteCore_DoCopyChannel(req, plane.Get(), img, MatteAlpha, c);
        if (Aborted(req, *img)) return false;
    }
    // Masks, and images whose plane memory refused, blur in place.
    const Tag switches[4] = {BlurDoRed, BlurDoGreen, BlurDoBlue, BlurDoAlpha};
    for (int i = 0; i < 4; ++i) tags.Set({switches[i], i == c});
    return img->BlurTagList(img, tags);
}

} // namespace matteblur

bool MatteCore_DoSoftenChannel(Request *req, Image *img, int channel, double size, int passes, int kind) {
    using namespace matteblur;
    return BlurChannel(req, img, channel, size, passes, kind);
}

bool MatteCore_DoMultiBox(Request *req, Image *img, int channel, double size, int passes) {
    using namespace matteblur;
    return BlurChannel(req, img, channel, size, passes, BlurMultiBox);
}

bool MatteCore_DoCopyChannel(Request *req, const Image *src, Image *dst, int from, int to) {
    using namespace matteblur;
    if (!src || !dst || from < MatteRed || from > MatteAlpha || to < MatteRed || to > MatteAlpha) return false;
    if (!src->DownloadGPUMem()) return false;
    const int f = StoredChannel(*src, from), t = StoredChannel(*dst, to);
    const auto into = ChannelOf<FltPixel>(t), of = ChannelOf<FltPixel>(f);
    // Float rows for every depth: a value copied into an integer image is
    // rounded once, and the channels left alone load and store unchanged.
    if (!PrepareRows(*dst)) return false;
    const ImgRectI dw = dst->DataWindow();
    if (!dst->IsNoData() && !dw.IsNull()) {
        const bool ok = ForEachRow(req, *dst, [&](int y, RowScratch &s) {
            FltPixel *px = LoadRow<FltPixel>(*dst, y, s);
            s.aux.resize(dw.Width());
            ReadSpanFlt(*src, y, dw.x0, dw.x1, s.aux.data());
            for (int i = 0; i < dw.Width(); ++i) px[i].*into = s.aux[i].*of;
            StoreRow(*dst, y, px);
        });
        if (!ok) return false;
    }
    dst->SetCanvasColorFltChan(t, src->GetCanvasColorFltChan(f));
    return true;
}

} // namespace Orvane
