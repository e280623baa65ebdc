// Image::ScaleOfImage and the resize request (ResizePreCalcTagList,
// ResizePostCalc, ResizeTagList, GetResizeFilterSupport): both run the
// separable resampler of Resample.h (docs/RESAMPLING.md).
//
// ScaleOfImage is the box filter at a whole shrink factor, where each output
// pixel's footprint is exactly one block; blocks reaching past the source
// range (the image rectangle joined with the data window) average the part
// that exists.
//
// The resize request reads ResizeFilter (default linear), ResizeWindow,
// ResizeXScale/YScale (default: dest's size over this image's),
// ResizeXOffset/YOffset (default 0), ResizeXEdges/YEdges (default Duplicate:
// the border pixel repeats, so a frame resized whole keeps its edges) and
// ResizeSourceWindow (default: the data window joined with the frame). The
// tables handed out by ResizePreCalcTagList are heap objects that remember
// what they were built from; ResizeTagList uses them only when they were
// built for the same request and cover dest's data window, and otherwise
// builds its own, so a stale cache can cost time but never change pixels.
#include <algorithm>
#include <cmath>
#include <cstdint>
#include <memory>

#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/Resample.h"
#include "host/image/ResizeFilters.h"

namespace Orvane {
namespace imgresize {

/// The abort flag of a request's render, or null.
const std::atomic<bool> *AbortOf(const Request *req) {
    const RenderTask *task = req ? req->GetTask() : nullptr;
    return task ? task->AbortFlag() : nullptr;
}

/// Where an image's pixels may be read by default: its frame joined with its data window.
ImgRectI SourceRange(const Image &img) { return img.Frame() | img.DataWindow(); }

/// A rectangle's corners divided by whole factors, rounded outward (floor for
/// the low corner, ceiling for the high one), endless sides kept.
ImgRectI DivideOutward(const ImgRectI &r, int fx, int fy) {
    if (r.IsNull()) return r;
    auto down = [](int v, int f) {
        return IsEndlessSide(v) ? v : static_cast<int>(std::floor(static_cast<double>(v) / f));
    };
    auto up = [](int v, int f) {
        return IsEndlessSide(v) ? v : static_cast<int>(std::ceil(static_cast<double>(v) / f));
    };
    return ImgRectI(down(r.x0, fx), down(r.y0, fy), up(r.x1, fx), up(r.y1, fy));
}

/// One axis table as handed out through void *: tagged, so that a pointer of
/// another kind or the other axis's table is recognised and not used.
struct ResizeTable {
    static constexpr uint32_t kMagic = 0x52737a54; // "RszT"
    uint32_t magic = kMagic;
    int axis = 0; ///< 0 x, 1 y
    ResampleAxis table;
};

const ResizeTable *AsTable(const void *p, int axis) {
    const auto *t = static_cast<const ResizeTable *>(p);
    return t && t->magic == ResizeTable::kMagic && t->axis == axis ? t : nullptr;
}

/// The two axis specs of a resize request from `src` into `dest`. False for
/// a source without size or an empty source window.
bool SpecsOf(const Image &src, const Image &dest, const TagList &tags, ResampleSpec &sx, ResampleSpec &sy) {
    if (src.Width() < 1 || src.Height() < 1) return false;
    const auto *given = tags.GetPtrAs<const ImgRectI>(ResizeSourceWindow);
    const ImgRectI range = given ? *given : SourceRange(src);
    if (range.IsNull()) return false;
    const int filter = ValidResizeFilter(static_cast<int>(tags.GetLong(ResizeFilter, RszLinear)));
    const int window = static_cast<int>(tags.GetLong(ResizeWindow, RszWindowHanning));
    auto edges = [](long long e) { return e >= EdgeCanvas && e <= EdgeMirror ? static_cast<int>(e) : EdgeDuplicate; };
    sx.filter = sy.filter = filter;
    sx.window = sy.window = window;
    sx.scale = tags.GetDouble(ResizeXScale, static_cast<double>(dest.Width()) / src.Width());
    sy.scale = tags.GetDouble(ResizeYScale, static_cast<double>(dest.Height()) / src.Height());
    sx.offset = tags.GetDouble(ResizeXOffset, 0.0);
    sy.offset = tags.GetDouble(ResizeYOffset, 0.0);
    sx.edges = edges(tags.GetLong(ResizeXEdges, EdgeDuplicate));
    sy.edges = edges(tags.GetLong(ResizeYEdges, EdgeDuplicate));
    sx.srcLo = range.x0, sx.srcHi = range.x1;
    sy.srcLo = range.y0, sy.srcHi = range.y1;
    // Build normalises filter and window; compare like with like.
    ResampleAxis probe;
    if (!probe.Build(sx, 0, 0)) return false;
    sx = probe.Spec();
    if (!probe.Build(sy, 0, 0)) return false;
    sy = probe.Spec();
    return true;
}

} // namespace imgresize

Ref<Image> Image::ScaleOfImage(Request *req, double xFactor, double yFactor) const {
    if (!(xFactor >= 1.0) || !(yFactor >= 1.0) || !std::isfinite(xFactor) || !std::isfinite(yFactor)) return nullptr;
    const int fx = static_cast<int>(std::min(std::lround(xFactor), static_cast<long>(MaxImageSide)));
    const int fy = static_cast<int>(std::min(std::lround(yFactor), static_cast<long>(MaxImageSide)));
    const int w = (width_ + fx - 1) / fx, h = (height_ + fy - 1) / fy;
    const ImgRectI dw = imgresize::DivideOutward(dataWindow_, fx, fy);
    const ImgRectI vw = imgresize::DivideOutward(validWindow_, fx, fy) & dw;
    Ref<Image> out = NewImageTagList({{ImgLikeImage, this},
                                      {ImgWidth, std::max(w, 1)},
                                      {ImgHeight, std::max(h, 1)},
                                      // The pixel aspect follows unequal factors; a uniform shrink keeps it.
                                      {ImgXScale, xScale_ * fx / std::min(fx, fy)},
                                      {ImgYScale, yScale_ * fy / std::min(fx, fy)},
                                      {ImgDataWindow, &dw},
                                      {ImgValidWindow, &vw},
                                      {ImgNoData, noData_},
                                      {ImgCanvasColor, &canvas_}});
    if (!out) return nullptr;
    out->Metadata() = metadata_;
    out->SetIsOpaque(opaque_);
    if (out->IsNoData()) return out;
    const ImgRectI range = imgresize::SourceRange(*this);
    ResampleAxis ax, ay;
    if (!ax.Build({RszBox, RszWindowHanning, 1.0 / fx, 0.0, EdgeRenormalise, range.x0, range.x1}, dw.x0, dw.Width()) ||
        !ay.Build({RszBox, RszWindowHanning, 1.0 / fy, 0.0, EdgeRenormalise, range.y0, range.y1}, dw.y0, dw.Height()))
        return nullptr;
    if (!ResampleImage(*this, *out, ax, ay, imgresize::AbortOf(req))) return nullptr;
    return out;
}

bool Image::ResizePreCalcTagList(Image *dest, void *&xTable, void *&yTable, const TagList &tags) const {
    xTable = yTable = nullptr;
    ResampleSpec sx, sy;
    if (!dest || !imgresize::SpecsOf(*this, *dest, tags, sx, sy)) return false;
    const ImgRectI dw = dest->DataWindow().IsNull() ? ImgRectI(0, 0, 0, 0) : dest->DataWindow();
    auto x = std::make_unique<imgresize::ResizeTable>();
    auto y = std::make_unique<imgresize::ResizeTable>();
    x->axis = 0, y->axis = 1;
    try {
        if (!x->table.Build(sx, dw.x0, dw.Width()) || !y->table.Build(sy, dw.y0, dw.Height())) return false;
    } catch (const std::bad_alloc &) {
        return false;
    }
    xTable = x.release();
    yTable = y.release();
    return true;
}

void Image::ResizePostCalc(void *&xTable, void *&yTable) {
    delete const_cast<imgresize::ResizeTable *>(imgresize::AsTable(xTable, 0));
    delete const_cast<imgresize::ResizeTable *>(imgresize::AsTable(yTable, 1));
    xTable = yTable = nullptr;
}

bool Image::ResizeTagList(Image *dest, void *xTable, void *yTable, const TagList &tags) const {
    if (!dest || dest == this) return false;
    ResampleSpec sx, sy;
    if (!imgresize::SpecsOf(*this, *dest, tags, sx, sy)) return false;
    dest->SetCanvasColor(canvas_);
    const ImgRectI dw = dest->DataWindow();
    if (dest->IsNoData() || dw.IsNull()) return true;
    auto *req = tags.GetPtrAs<Request>(WorkRequest);

    // The given tables when they were made for this request and window, else our own.
    const auto *gx = imgresize::AsTable(xTable, 0), *gy = imgresize::AsTable(yTable, 1);
    ResampleAxis ownX, ownY;
    const ResampleAxis *ax = &ownX, *ay = &ownY;
    try {
        if (gx && gx->table.IsValid() && gx->table.Spec() == sx && gx->table.Covers(dw.x0, dw.x1))
            ax = &gx->table;
        else if (!ownX.Build(sx, dw.x0, dw.Width()))
            return false;
        if (gy && gy->table.IsValid() && gy->table.Spec() == sy && gy->table.Covers(dw.y0, dw.y1))
            ay = &gy->table;
        else if (!ownY.Build(sy, dw.y0, dw.Height()))
            return false;
    } catch (const std::bad_alloc &) {
        return false;
    }
    if (tags.GetBool(WorkUseGPU, false) && ResampleImageOnDevice(req, *this, *dest, *ax, *ay)) return true;
    return ResampleImage(*this, *dest, *ax, *ay, imgresize::AbortOf(req), tags.GetBool(WorkThreaded, true));
}

double Image::GetResizeFilterSupport(int rszType) { return ResizeFilterSupport(rszType); }

} // namespace Orvane
