// Image::CopyField and Image::ReverseFieldDominance.
//
// Lines are numbered from the top of the image rectangle: line t is row
// y = height - 1 - t. Field f holds the lines with t % 2 == f, so field 0 holds
// the top line whatever the data window; the numbering goes on beyond the
// frame for data windows that reach past it.
//
// A half-height field image has row yh at frame row 2 * yh + b, where b (0 or
// 1) is the frame row of its bottom line. Its YScale is doubled (each pixel
// stands for two lines) and ImgFieldOffset is b * 0.5 / its height: half a
// field line up for the field that does not hold the frame's bottom row.
#include <algorithm>
#include <cstring>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"

namespace Orvane {
namespace imgfields {

int FloorDiv2(int v) { return v >> 1; } // arithmetic shift: floor for negatives too
int CeilDiv2(int v) { return -((-v) >> 1); }
/// Lines of field f in a frame of h lines.
int FieldLines(int h, int f) { return f == 0 ? (h + 1) / 2 : h / 2; }

/// Writes row dy of dst (over its data window) from row sy of src: src's
/// pixels where it has them, its canvas elsewhere, converted to dst's depth.
void CopyRow(const Image &src, Image &dst, int sy, int dy, std::vector<FltPixel> &span) {
    uint8_t *out = dst.ScanLine(dy);
    if (!out) return;
    const ImgRectI &dw = dst.DataWindow(), &sw = src.DataWindow();
    if (src.Depth() == dst.Depth() && src.HasScanLineData() && sy >= sw.y0 && sy < sw.y1 && dw.x0 >= sw.x0 &&
        dw.x1 <= sw.x1) {
        std::memcpy(out, src.PixelAddress(dw.x0, sy), dst.RowBytes());
        return;
    }
    span.resize(dw.Width());
    ReadSpanFlt(src, sy, dw.x0, dw.x1, span.data());
    StoreFlt(dst.Depth(), span.data(), dw.Width(), out);
}

/// Frame rows [r.y0, r.y1) as the rows of a field whose row yh is frame row 2 * yh + b.
ImgRectI FieldRows(const ImgRectI &r, int b) {
    if (r.IsNull()) return r;
    ImgRectI f(r.x0, CeilDiv2(r.y0 - b), r.x1, FloorDiv2(r.y1 - 1 - b) + 1);
    if (f.IsNull()) f.SetNull();
    return f;
}

} // namespace imgfields

Ref<Image> Image::CopyField(int field, Image *into, int destField, int mode) const {
    using namespace imgfields;
    if ((field != 0 && field != 1) || destField < -1 || destField > 2 || (mode != 1 && mode != 3)) return nullptr;
    const int h = height_;
    const int srcLines = FieldLines(h, field);
    if (srcLines < 1) return nullptr;

    if (destField == -1) {
        const int b = h + 1 - 2 * srcLines - field;
        const ImgRectI dw = FieldRows(dataWindow_, b), vw = FieldRows(validWindow_, b);
        Ref<Image> out = NewImageTagList({{ImgLikeImage, this},
                                          {ImgHeight, srcLines},
                                          {ImgYScale, yScale_ * 2.0},
                                          {ImgDataWindow, &dw},
                                          {ImgValidWindow, &vw},
                                          {ImgNoData, noData_},
                                          {ImgCanvasColor, &canvas_},
                                          {ImgField, field},
                                          {ImgFullHeight, h},
                                          {ImgFieldOffset, b * 0.5 / srcLines}});
        if (!out) return nullptr;
        out->Metadata() = metadata_;
        out->SetIsOpaque(opaque_);
        if (out->IsNoData() || dw.IsNull()) return out;
        if (!out->AllocScanLineData()) return nullptr;
        ParallelRange(
            dw.y0, dw.y1,
            [&](int y0, int y1) {
                std::vector<FltPixel> span;
                for (int y = y0; y < y1; ++y) CopyRow(*this, *out, 2 * y + b, y, span);
            },
            8);
        return out;
    }

    const int dest = destField == 2 ? field : destField;
    Ref<Image> target;
    if (into) {
        if (into->Height() != h || into->IsReadOnly()) return nullptr;
        target = Ref<Image>(into);
    } else {
        target = NewImageTagList({{ImgLikeImage, this},
                                  {ImgDataWindow, &dataWindow_},
                                  {ImgValidWindow, &validWindow_},
                                  {ImgNoData, noData_},
                                  {ImgCanvasColor, &canvas_}});
        if (!target) return nullptr;
        target->Metadata() = metadata_;
    }
    if (target->IsNoData() || target->DataWindow().IsNull()) return target;
    if (!target->AllocScanLineData()) return nullptr;
    // Writing a field of this image into itself reads from a copy.
    Ref<Image> held;
    const Image *src = this;
    if (into == this) {
        held = CopyOfImage(this);
        if (!held) return nullptr;
        src = held.Get();
    }
    const ImgRectI dw = target->DataWindow();
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            std::vector<FltPixel> span;
            for (int y = y0; y < y1; ++y) {
                const int t = h - 1 - y, inFrame = t >= 0 && t < h;
                int k; // the source field's line that this line shows
                if (mode == 1) {
                    if ((t - dest) & 1) continue; // a line of the other field
                    k = FloorDiv2(t - dest);
                    if (inFrame && (k < 0 || k >= srcLines)) continue;
                } else {
                    // Line doubling: lines 2k + dest and 2k + dest + 1 both show line k.
                    k = FloorDiv2(t - dest);
                    if (inFrame) k = std::clamp(k, 0, srcLines - 1);
                }
                CopyRow(*src, *target, h - 1 - (2 * k + field), y, span);
            }
        },
        8);
    return target;
}

void Image::ReverseFieldDominance() {
    if (readOnly_ || !HasScanLineData() || dataWindow_.IsNull()) return;
    const ImgRectI dw = dataWindow_;
    const int top = height_ - 1; // the frame's top row keeps its line
    std::vector<uint8_t> canvasRow(RowBytes());
    {
        const std::vector<FltPixel> canvas(dw.Width(), canvas_);
        StoreFlt(depth_, canvas.data(), dw.Width(), canvasRow.data());
    }
    const size_t auxFloats = static_cast<size_t>(dw.Width());
    // Upward, so that each row is read before it is overwritten.
    for (int y = dw.y0; y < dw.y1; ++y) {
        if (y == top) continue;
        const int from = y + 1;
        const bool inside = from < dw.y1;
        std::memcpy(ScanLine(y), inside ? ScanLine(from) : canvasRow.data(), RowBytes());
        for (const AuxPlane &plane : aux_) {
            if (!plane.data) continue;
            float *row = plane.Floats() + static_cast<size_t>(y - dw.y0) * auxFloats;
            if (inside)
                std::memcpy(row, row + auxFloats, auxFloats * sizeof(float));
            else
                std::fill(row, row + auxFloats, 0.f);
        }
    }
}

} // namespace Orvane
