// TransformMatrix::MergeConcatenateTagList: compositing onto the source of a
// pending transform, so that the background of a merge is resampled once,
// at the end of the chain, with the merge already in its pixels.
//
// The foreground (an Image or a TransformMatrix) is placed by
//
//     fg source -> bg source  =  bgPending^-1 x Placement x fgPending
//
// (Placement, tag MrgPlacement, maps the foreground's output frame into the
// background's output frame, in pixels), resampled once with the transform
// sampler into the background's source space (a whole-pixel move is read in
// place instead, with no resampling), and composited onto a copy of the
// background's source (MergeImagesTagList) over
//
//     MergeDataWindow(placed foreground window, background data window)
//
// with endless sides (foreground edges other than Canvas) cut to the
// background's source frame, and, outside pre-calculation, cut to what the
// request's region reads through the pending matrix. The result becomes the
// new source; the pending matrix and sampling stay the background's. A
// singular pending matrix is made into pixels first (the merge then works
// in the output frame).
//
// With XfMergeToolBlend -1, `fg` is a merged stack built on the same
// background, and the call mixes it back over this (unmerged) background
// with the asking tool's common Blend and Process switches (Replace with
// blend, docs/MERGE.md); stacks whose pending matrices differ are made into
// pixels first.
//
// Tags: MrgPlacement, the merge request (Mrg*), XfFilter, XfWindow, XfEdges
// (how the foreground is resampled; its own sampling when absent),
// XfRequest or WorkRequest, WorkUseGPU, XfMergeToolBlend.
#include <algorithm>
#include <cmath>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/image/MergeModes.h"
#include "host/image/NewImage.h"
#include "host/image/TransformMatrix.h"
#include "host/image/TransformSampler.h"

namespace Orvane {
namespace xfmerge {

Request *RequestOf(const TagList &tags) {
    if (auto *req = tags.GetPtrAs<Request>(XfRequest)) return req;
    return tags.GetPtrAs<Request>(WorkRequest);
}

/// A mapping that moves whole pixels and nothing else.
bool IsWholeMove(const Matrix3 &m, int &dx, int &dy) {
    constexpr double eps = 1e-9;
    if (!m.IsAffine() || std::fabs(m(0, 0) - 1.0) > eps || std::fabs(m(1, 1) - 1.0) > eps || std::fabs(m(0, 1)) > eps ||
        std::fabs(m(1, 0)) > eps)
        return false;
    const double rx = std::round(m(0, 2)), ry = std::round(m(1, 2));
    if (std::fabs(m(0, 2) - rx) > eps || std::fabs(m(1, 2) - ry) > eps) return false;
    if (std::fabs(rx) >= DomainEndless || std::fabs(ry) >= DomainEndless) return false;
    dx = static_cast<int>(rx);
    dy = static_cast<int>(ry);
    return true;
}

/// Endless sides of `w` replaced by the sides of `frame`.
ImgRectI CutEndless(ImgRectI w, const ImgRectI &frame) {
    if (w.x0 <= -DomainEndless) w.x0 = frame.x0;
    if (w.y0 <= -DomainEndless) w.y0 = frame.y0;
    if (w.x1 >= DomainEndless) w.x1 = frame.x1;
    if (w.y1 >= DomainEndless) w.y1 = frame.y1;
    if (w.IsNull()) w.SetNull();
    return w;
}

/// The foreground's Z for each pixel of `placed`, from the source pixel
/// under its centre (depth is never filtered); the far value outside.
bool PlaceZ(const Image &src, Image &placed, const Matrix3 &outputToSource, float far) {
    if (!src.HasAuxChannel(AuxChannelKind::Z) || placed.IsNoData() || !placed.AddAuxChannel(AuxChannelKind::Z))
        return false;
    const ImgRectI &pw = placed.DataWindow(), &sw = src.DataWindow();
    for (int y = pw.y0; y < pw.y1; ++y) {
        float *out = placed.AuxRow(AuxChannelKind::Z, y);
        if (!out) return false;
        for (int x = pw.x0; x < pw.x1; ++x) {
            double u, v;
            outputToSource.Apply(x + 0.5, y + 0.5, u, v);
            const double fu = std::floor(u), fv = std::floor(v);
            const bool inside = fu >= sw.x0 && fu < sw.x1 && fv >= sw.y0 && fv < sw.y1;
            const float *row = inside ? src.AuxRow(AuxChannelKind::Z, static_cast<int>(fv)) : nullptr;
            out[x - pw.x0] = row ? row[static_cast<int>(fu) - sw.x0] : far;
        }
    }
    return true;
}

} // namespace xfmerge

bool TransformMatrix::MergeConcatenateTagList(Parameter *fg, const TagList &tags) {
    if (!source_) return false;
    Request *req = xfmerge::RequestOf(tags);
    if (req) req_ = req;
    const bool precalc = (req && req->IsPreCalc()) || source_->IsNoData();
    const TagList work{{WorkRequest, static_cast<const void *>(req)}};

    // ---- a merged stack mixed back over this background ----
    if (tags.GetLong(XfMergeToolBlend, 0) == -1) {
        Ref<TransformMatrix> stack;
        if (auto *tm = dynamic_cast<TransformMatrix *>(fg))
            stack = MakeRef<TransformMatrix>(tm, req, nullptr, 0u, TimeUndefined);
        else if (auto *img = dynamic_cast<Image *>(fg))
            stack = MakeRef<TransformMatrix>(img);
        if (!stack || !stack->IsValid()) return true;
        if (stack->source_ == source_ && stack->matrix_ == matrix_) return true; // nothing was merged
        const Operator *op = req ? req->GetOperator() : nullptr;
        TagList mix{{MrgOperator, MrgReplace}, {MrgBlend, op ? req->GetInputNumber(op->Common().blend, 1.0) : 1.0}};
        const Tag channels[4] = {MrgDoRed, MrgDoGreen, MrgDoBlue, MrgDoAlpha};
        for (int c = 0; c < 4; ++c)
            mix.Set({channels[c], !op || req->GetInputNumber(op->Common().process[c], 1.0) >= 0.5});
        const bool sameSpace = stack->matrix_ == matrix_ && stack->width_ == width_ && stack->height_ == height_ &&
                               stack->source_->Frame() == source_->Frame();
        if (!sameSpace) {
            const TagList flatten{{XfFlatten, 1}, {XfRequest, static_cast<const void *>(req)}};
            if (!ImageConcatenateTagList(flatten) || !stack->ImageConcatenateTagList(flatten)) return false;
        }
        const Image &top = *stack->source_, &under = *source_;
        ImgRectI dw = MergeDataWindow(MergeSettings::FromTags(mix), top.DataWindow(), top.GetCanvasColor(),
                                      under.DataWindow(), under.GetCanvasColor());
        Ref<Image> out = NewImageTagList(
            {{ImgLikeImage, &under}, {ImgDataWindow, &dw}, {ImgValidWindow, &dw}, {ImgNoData, precalc}});
        if (!out) return false;
        out->Metadata() = under.Metadata();
        mix.Set({WorkRequest, static_cast<const void *>(req)});
        if (!MergeImagesTagList(&top, &under, out.Get(), mix)) return false;
        source_ = std::move(out);
        return true;
    }

    // ---- a foreground composited onto this background ----
    Ref<TransformMatrix> fore;
    if (auto *tm = dynamic_cast<TransformMatrix *>(fg))
        fore = MakeRef<TransformMatrix>(tm, req, nullptr, 0u, TimeUndefined);
    else if (auto *img = dynamic_cast<Image *>(fg))
        fore = MakeRef<TransformMatrix>(img);
    if (!fore || !fore->IsValid()) return true; // no foreground: the background as it is

    Matrix3 toSource;
    if (!matrix_.Invert(toSource)) {
        // Nothing maps back into a collapsed source: merge in the output frame.
        if (!ImageConcatenateTagList({{XfFlatten, 1}, {XfRequest, static_cast<const void *>(req)}})) return false;
        toSource = Matrix3::Identity();
    }
    const auto *placement = tags.GetPtrAs<const Matrix3>(MrgPlacement);
    const Matrix3 fgToBg = toSource * (placement ? *placement : Matrix3::Identity()) * fore->matrix_;
    TransformSampling sampling = fore->Sampling();
    if (tags.Has(XfFilter)) sampling.filter = ValidResizeFilter(static_cast<int>(tags.GetLong(XfFilter)));
    if (tags.Has(XfWindow)) sampling.window = ValidResizeWindow(static_cast<int>(tags.GetLong(XfWindow)));
    if (tags.Has(XfEdges)) sampling.edges = static_cast<int>(std::clamp<long long>(tags.GetLong(XfEdges), 0, 3));

    const MergeSettings settings = MergeSettings::FromTags(tags);
    const Image &bg = *source_;
    const Image &fgSrc = *fore->source_;
    const ImgRectI frame = bg.Frame();
    int dx = 0, dy = 0;
    const bool wholeMove = sampling.edges == EdgeCanvas && xfmerge::IsWholeMove(fgToBg, dx, dy);
    ImgRectI placed = fgSrc.DataWindow();
    if (wholeMove)
        placed.Offset(dx, dy);
    else
        placed = xfmerge::CutEndless(TransformedWindow(fgSrc.DataWindow(), fgToBg, sampling), frame);

    ImgRectI dw = MergeDataWindow(settings, placed, fgSrc.GetCanvasColor(), bg.DataWindow(), bg.GetCanvasColor());
    if (!precalc && req && req->RoI())
        dw &= xfmerge::CutEndless(TransformSourceWindow(req->RoI()->rect, matrix_, Sampling()), frame);

    // The foreground in the background's source space.
    Ref<Image> fgPixels;
    if (wholeMove) {
        fgPixels = fore->source_;
    } else {
        Matrix3 back;
        if (!fgToBg.Invert(back)) return true; // a collapsed foreground covers nothing
        TransformMatrix moved(fore->source_.Get());
        moved.matrix_ = fgToBg;
        moved.width_ = bg.Width(), moved.height_ = bg.Height();
        moved.xScale_ = bg.XScale(), moved.yScale_ = bg.YScale();
        moved.filter_ = sampling.filter, moved.window_ = sampling.window, moved.edges_ = sampling.edges;
        ImgRectI region = placed & dw;
        TagList apply = work;
        apply.Set({ImgDataWindow, &region});
        if (region.IsNull()) {
            // Nothing of the foreground lands inside: its canvas alone counts.
            const FltPixel canvas = fgSrc.GetCanvasColor();
            fgPixels = NewImageTagList({{ImgLikeImage, &bg}, {ImgDataWindow, &region}, {ImgCanvasColor, &canvas}});
        } else {
            fgPixels = moved.ApplyTransformTagList(apply);
        }
        if (!fgPixels) return false;
        if (settings.zMerge && !precalc) xfmerge::PlaceZ(fgSrc, *fgPixels, back, MergeFarZ(settings));
    }

    Ref<Image> out =
        NewImageTagList({{ImgLikeImage, &bg}, {ImgDataWindow, &dw}, {ImgValidWindow, &dw}, {ImgNoData, precalc}});
    if (!out) return false;
    out->Metadata() = bg.Metadata();
    TagList mergeTags = tags;
    mergeTags.Set({MrgFgOffsetX, dx});
    mergeTags.Set({MrgFgOffsetY, dy});
    mergeTags.Set({WorkRequest, static_cast<const void *>(req)});
    if (!MergeImagesTagList(fgPixels.Get(), &bg, out.Get(), mergeTags)) return false;
    source_ = std::move(out);
    return true;
}

} // namespace Orvane
