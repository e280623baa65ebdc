// ShapeRasterizerInputs::Rasterize: AGG's cell generator gives, per pixel
// cell, the signed area and the cover that each edge leaves there (vertices
// on a 1/256 pixel grid); the sweep here turns them into coverage in float,
// without AGG's rounding to 8 bits, and writes the mask's rows.
#include "host/shape/ShapeRasterizer.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstdlib>
#include <new>
#include <utility>
#include <vector>

#include <agg_rasterizer_cells_aa.h>
#include <agg_rasterizer_scanline_aa_nogamma.h>
#include <agg_rasterizer_sl_clip.h>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/shape/Shape.h"

namespace Orvane {

namespace {

/// Rows per band: a fixed height, so that the bands (and the clipped edges
/// of each) and therefore the bits never depend on the number of workers.
constexpr int kBandRows = 32;
/// AGG's cell blocks (4096 cells each) a band may take; a band that needs
/// more fails rather than drop edges.
constexpr unsigned kCellBlockLimit = 1024;
/// A full pixel in the units of (cover << 9) - area: 2 x 256 x 256.
constexpr long long kFullArea = 2LL << (2 * agg::poly_subpixel_shift);

using Cells = agg::rasterizer_cells_aa<agg::cell_aa>;

/// The flattened shape in pixel coordinates; sub-path k is points
/// [starts[k], starts[k + 1]).
/// Segments are looked at in runs of this many: a band skips a run that lies
/// wholly above or below it.
constexpr size_t kRun = 32;

struct PixelPath {
    std::vector<double> xy;
    std::vector<size_t> starts;
    /// The lowest and highest y of each run of kRun segments of each sub-path
    /// (the closing segment counted with the last run), in order.
    std::vector<std::pair<double, double>> runs;

    /// Finds the runs' extents once the points are in.
    void MeasureRuns() {
        runs.clear();
        for (size_t k = 0; k + 1 < starts.size(); ++k) {
            const size_t first = starts[k], count = starts[k + 1] - first;
            for (size_t i = 0; i < count; i += kRun) {
                double lo = HUGE_VAL, hi = -HUGE_VAL;
                for (size_t j = i; j <= std::min(i + kRun, count); ++j) {
                    const double y = xy[2 * (first + j % count) + 1];
                    lo = std::min(lo, y), hi = std::max(hi, y);
                }
                runs.emplace_back(lo, hi);
            }
        }
    }
};

class CoverageRule {
public:
    CoverageRule(bool evenOdd, bool invert) : evenOdd_(evenOdd), invert_(invert) {}
    /// The value of a pixel whose doubled area, in 1/256 pixel units squared, is `v`.
    float operator()(long long v) const {
        v = v < 0 ? -v : v;
        if (evenOdd_) {
            v %= 2 * kFullArea;
            if (v > kFullArea) v = 2 * kFullArea - v;
        } else if (v > kFullArea) {
            v = kFullArea;
        }
        const float c = static_cast<float>(v) * (1.0f / static_cast<float>(kFullArea));
        return invert_ ? 1.0f - c : c;
    }

private:
    bool evenOdd_, invert_;
};

/// Writes row y's values over columns [x0, x1) into out.
void SweepRow(const Cells &cells, int y, int x0, int x1, const CoverageRule &value, float *out) {
    int pos = x0;
    long long cover = 0;
    auto fill = [&](int to) {
        std::fill(out + (pos - x0), out + (to - x0), value(cover << (agg::poly_subpixel_shift + 1)));
        pos = to;
    };
    if (cells.total_cells() && y >= cells.min_y() && y <= cells.max_y()) {
        unsigned n = cells.scanline_num_cells(static_cast<unsigned>(y));
        const agg::cell_aa *const *c = cells.scanline_cells(static_cast<unsigned>(y));
        while (n) {
            const int cx = (*c)->x;
            if (cx >= x1) break;
            if (cx > pos) fill(cx);
            long long area = 0;
            do {
                area += (*c)->area;
                cover += (*c)->cover;
                ++c;
            } while (--n && (*c)->x == cx);
            if (area != 0 && cx >= x0) {
                out[cx - x0] = value((cover << (agg::poly_subpixel_shift + 1)) - area);
                pos = cx + 1;
            }
        }
    }
    if (pos < x1) fill(x1);
}

PixelPath PixelPathOf(const Shape &shape, double xScale, double yScale) {
    Ref<Shape> flat;
    const Shape *src = &shape;
    if (!shape.IsFlat()) {
        flat = shape.FlattenOfShapeTagList({{ShapeTolerance, 1.0 / std::max(xScale, yScale)}}); // 1-pixel steps
        src = flat.Get();
    }
    PixelPath path;
    path.xy.reserve(2 * static_cast<size_t>(src->GetCount()));
    for (const Shape::SubPath &sp : src->SubPaths()) {
        if (sp.points.size() < 3) continue; // no area
        path.starts.push_back(path.xy.size() / 2);
        for (const Shape::Vertex &v : sp.points) {
            path.xy.push_back(v.x * xScale);
            path.xy.push_back(v.y * yScale);
        }
    }
    path.starts.push_back(path.xy.size() / 2);
    path.MeasureRuns();
    return path;
}

/// Adds the path's edges, clipped to `box`, to the cells; every sub-path is closed.
void AddEdges(const PixelPath &path, const ImgRectI &box, Cells &cells) {
    agg::rasterizer_sl_clip_dbl clip;
    clip.clip_box(box.x0, box.y0, box.x1, box.y1);
    const std::pair<double, double> *run = path.runs.data();
    for (size_t k = 0; k + 1 < path.starts.size(); ++k) {
        const double *p = path.xy.data() + 2 * path.starts[k];
        const size_t count = path.starts[k + 1] - path.starts[k];
        clip.move_to(p[0], p[1]);
        for (size_t i = 0; i < count; i += kRun, ++run) {
            const size_t end =
                std::min(i + kRun, count); // segments i -> i + 1 .. end - 1 -> end (end = count: back to 0)
            if (run->second < box.y0 || run->first > box.y1) {
                // Wholly above or below the band: its clipped edges add nothing; only the pen moves.
                clip.move_to(p[2 * (end % count)], p[2 * (end % count) + 1]);
                continue;
            }
            for (size_t j = i + 1; j <= end; ++j) clip.line_to(cells, p[2 * (j % count)], p[2 * (j % count) + 1]);
        }
    }
    cells.sort_cells();
}

} // namespace

bool ShapeRasterizerInputs::Rasterize(Request *req, const Shape &shape, Image *mask, bool invert,
                                      int windingRule) const {
    if (!mask || !mask->IsMask()) return false;
    const ImgRectI win = mask->DataWindow();
    if (mask->IsNoData() || win.IsNull()) return true;
    if (!mask->AllocScanLineData()) return false;
    const double xScale = mask->Width();
    const double yScale = xScale * mask->XScale() / mask->YScale();
    PixelPath path;
    try {
        path = PixelPathOf(shape, xScale, yScale);
    } catch (const std::bad_alloc &) {
        return false;
    }
    const RenderTask *task = req ? req->GetTask() : nullptr;
    const CoverageRule value(windingRule == ShapeWindingEvenOdd, invert);
    const int depth = mask->Depth(), width = win.Width();
    std::atomic<bool> failed{false};
    auto band = [&](int b) {
        const ImgRectI box(win.x0, win.y0 + b * kBandRows, win.x1, std::min(win.y0 + (b + 1) * kBandRows, win.y1));
        try {
            Cells cells(kCellBlockLimit);
            AddEdges(path, box, cells);
            if (cells.total_cells() >= kCellBlockLimit * 4096u) {
                failed = true;
                return;
            }
            std::vector<float> values(depth == DepthAFlt32 ? 0 : static_cast<size_t>(width));
            std::vector<FltPixel> pixels(values.size());
            for (int y = box.y0; y < box.y1; ++y) {
                if (failed.load(std::memory_order_relaxed) || (task && task->IsAborted()) || mask->CheckAbort()) {
                    failed = true;
                    return;
                }
                float *out = depth == DepthAFlt32 ? mask->Row<float>(y) : values.data();
                SweepRow(cells, y, win.x0, win.x1, value, out);
                if (depth == DepthAFlt32) continue;
                for (int i = 0; i < width; ++i) pixels[i].A = values[i];
                StoreFlt(depth, pixels.data(), width, mask->ScanLine(y));
            }
        } catch (const std::bad_alloc &) {
            failed = true;
        }
    };
    ParallelFor((win.Height() + kBandRows - 1) / kBandRows, band);
    return !failed.load();
}

} // namespace Orvane
