// DoGarbageMatte (MatteSteps.h): a mask taking alpha away (garbage) or making
// it solid, with the data window widened where the mask reaches beyond it.
#include <algorithm>

#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/matte/MatteRows.h"
#include "host/matte/MatteSteps.h"

namespace Orvane {
namespace garbagematte {

using namespace matterows;

struct GarbageMatte {
    bool solid, premultiplied, invert;

    /// The mask's value as the step uses it: held to 0..1, inverted on request.
    float MaskValue(float m) const {
        m = std::clamp(m, 0.f, 1.f); // also NaN to 0
        return invert ? 1.f - m : m;
    }
    template <class P> void Apply(P &p, float m) const {
        constexpr float one = kOne<P>;
        if (solid) {
            Put(p.A, Val(p.A) + m * (one - Val(p.A)));
            return;
        }
        const float keep = 1.f - m;
        Put(p.A, Val(p.A) * keep);
        if (!premultiplied) return;
        Put(p.R, Val(p.R) * keep);
        Put(p.G, Val(p.G) * keep);
        Put(p.B, Val(p.B) * keep);
    }
    /// Whether the result on the canvas colour `c` depends on the mask: then
    /// the mask's pixels beyond the image's window must become pixels.
    bool DependsOnMask(const FltPixel &c) const {
        if (solid) return c.A != 1.f;
        return c.A != 0.f || (premultiplied && (c.R != 0.f || c.G != 0.f || c.B != 0.f));
    }
};

/// A copy of `img` over `window` (its pixels, its canvas elsewhere); null
/// when memory was refused.
Ref<Image> WidenedCopy(const Image &img, const ImgRectI &window) {
    const FltPixel canvas = img.GetCanvasColor();
    Ref<Image> out = NewImageTagList(
        {{ImgLikeImage, &img}, {ImgDataWindow, &window}, {ImgNoData, img.IsNoData()}, {ImgCanvasColor, &canvas}});
    if (!out) return nullptr;
    out->SetScale(img.XScale(), img.YScale());
    out->Metadata() = img.Metadata();
    if (img.IsNoData()) return out;
    if (!img.DownloadGPUMem() || !out->AllocScanLineData()) return nullptr;
    out->ImageCopy(&img);
    return out;
}

} // namespace garbagematte

Ref<Image> DoGarbageMatte(Request *req, Image *img, const Image *mask, int mode, bool premultiplied, bool invert) {
    using namespace garbagematte;
    if (!img || !mask) return Ref<Image>(img);
    if (!mask->DownloadGPUMem()) return nullptr;
    const GarbageMatte g{mode == GarbageMatteSolid, premultiplied, invert};
    const float maskCanvas = g.MaskValue(mask->GetCanvasColor().A);
    // Beyond the image's window the result is its canvas's, through the mask.
    // The mask's window becomes pixels too when the mask's canvas is not
    // clear (it covers all but its shapes), or when the mask changes the
    // result on the image's canvas; otherwise nothing there would differ.
    const ImgRectI &dw = img->DataWindow(), &mw = mask->DataWindow();
    const bool widen = !dw.Contains(mw) && (maskCanvas != 0.f || g.DependsOnMask(img->GetCanvasColor()));
    Ref<Image> out = widen ? WidenedCopy(*img, dw | mw) : Ref<Image>(img);
    if (!out) return nullptr;
    if (widen) out->SetIsOpaque(false);
    if (!StepBy(req, *out, *mask, [&g](auto &p, float m) { g.Apply(p, g.MaskValue(m)); })) return nullptr;
    return out;
}

} // namespace Orvane
