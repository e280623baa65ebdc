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

/// Segments are looked at in runs of this many: a band skips a run that lies
/// wholly above or below it.
constexpr size_t kRun = 32;

} // namespace

/// The flattened shapes in pixel coordinates; sub-path k is points
/// [starts[k], starts[k + 1]). (Outside the unnamed namespace: ShapeCoverage holds one.)
struct ShapeCoveragePixelPath {
    std::vector<double> xy;
    std::vector<size_t> starts;
    /// The lowest and highest y of each run of kRun segments of each sub-path
    /// (the closing segment counted with the last run), in order.
    std::vector<std::pair<double, double>> runs;

    /// Finds the runs' extents of sub-paths `first` on, once their points are in.
    void MeasureRuns(size_t fromPath) {
        for (size_t k = fromPath; k + 1 < starts.size(); ++k) {
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

namespace {

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

/// Walks row y over columns [x0, x1) from left to right, calling emit(from, to, value) for each stretch of one
/// value (a cell's pixel, or the constant run up to the next cell).
template <class Emit> void WalkRow(const Cells &cells, int y, int x0, int x1, const CoverageRule &value, Emit &&emit) {
    int pos = x0;
    long long cover = 0;
    auto fill = [&](int to) {
        emit(pos, to, value(cover << (agg::poly_subpixel_shift + 1)));
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
                emit(cx, cx + 1, value((cover << (agg::poly_subpixel_shift + 1)) - area));
                pos = cx + 1;
            }
        }
    }
    if (pos < x1) fill(x1);
}

/// Adds the path's edges, clipped to `box`, to the cells; every sub-path is closed.
void AddEdges(const ShapeCoveragePixelPath &path, const ImgRectI &box, Cells &cells) {
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

// ---- ShapeCoverage ----

struct ShapeCoverage::Path : ShapeCoveragePixelPath {
    double xScale = 1.0, yScale = 1.0;
    double x0 = HUGE_VAL, y0 = HUGE_VAL, x1 = -HUGE_VAL, y1 = -HUGE_VAL;
};

struct ShapeCoverage::Band::Cells {
    Cells() : cells(kCellBlockLimit) {}
    agg::rasterizer_cells_aa<agg::cell_aa> cells;
};

ShapeCoverage::ShapeCoverage(double xScale, double yScale) : path_(std::make_unique<Path>()) {
    path_->xScale = xScale;
    path_->yScale = yScale;
    path_->starts.push_back(0);
}

ShapeCoverage::~ShapeCoverage() = default;
ShapeCoverage::ShapeCoverage(ShapeCoverage &&) noexcept = default;
ShapeCoverage &ShapeCoverage::operator=(ShapeCoverage &&) noexcept = default;

void ShapeCoverage::Add(const Shape &shape, bool oriented) {
    Path &path = *path_;
    Ref<Shape> flat;
    const Shape *src = &shape;
    if (!shape.IsFlat()) {
        flat =
            shape.FlattenOfShapeTagList({{ShapeTolerance, 1.0 / std::max(path.xScale, path.yScale)}}); // 1-pixel steps
        src = flat.Get();
    }
    bool reverse = false;
    if (oriented) {
        double twiceArea = 0.0;
        for (const Shape::SubPath &sp : src->SubPaths())
            for (size_t i = 0, n = sp.points.size(); i < n; ++i) {
                const Shape::Vertex &p = sp.points[i], &q = sp.points[(i + 1) % n];
                twiceArea += p.x * q.y - q.x * p.y;
            }
        reverse = twiceArea * path.xScale * path.yScale < 0.0;
    }
    const size_t firstPath = path.starts.size() - 1;
    path.xy.reserve(path.xy.size() + 2 * static_cast<size_t>(src->GetCount()));
    for (const Shape::SubPath &sp : src->SubPaths()) {
        if (sp.points.size() < 3) continue; // no area
        // A sub-path with a point at no finite place has no area anyone can draw.
        if (!std::all_of(sp.points.begin(), sp.points.end(), [&](const Shape::Vertex &v) {
                return std::isfinite(v.x * path.xScale) && std::isfinite(v.y * path.yScale);
            }))
            continue;
        const size_t n = sp.points.size();
        for (size_t i = 0; i < n; ++i) {
            const Shape::Vertex &v = sp.points[reverse ? n - 1 - i : i];
            const double x = v.x * path.xScale, y = v.y * path.yScale;
            path.xy.push_back(x);
            path.xy.push_back(y);
            path.x0 = std::min(path.x0, x), path.x1 = std::max(path.x1, x);
            path.y0 = std::min(path.y0, y), path.y1 = std::max(path.y1, y);
        }
        path.starts.push_back(path.xy.size() / 2);
    }
    path.MeasureRuns(firstPath);
}

bool ShapeCoverage::IsEmpty() const { return path_->starts.size() < 2; }

ImgRectI ShapeCoverage::PixelBox() const {
    const Path &p = *path_;
    if (IsEmpty() || !std::isfinite(p.x0 + p.x1 + p.y0 + p.y1)) return ImgRectI();
    // A vertex moves by up to half a step of the 1/256 pixel grid; the box takes the whole pixels around.
    const auto lo = [](double v) { return static_cast<int>(std::clamp(std::floor(v), -2e9, 2e9)); };
    const auto hi = [](double v) { return static_cast<int>(std::clamp(std::floor(v) + 1.0, -2e9, 2e9)); };
    return ImgRectI(lo(p.x0), lo(p.y0), hi(p.x1), hi(p.y1));
}

ShapeCoverage::Band::Band() : cells_(std::make_unique<Cells>()) {}
ShapeCoverage::Band::~Band() = default;

bool ShapeCoverage::Band::Build(const ShapeCoverage &coverage, const ImgRectI &box) {
    Cells &c = *cells_;
    c.cells.reset();
    AddEdges(*coverage.path_, box, c.cells);
    return c.cells.total_cells() < kCellBlockLimit * 4096u;
}

void ShapeCoverage::Band::Sweep(int y, int x0, int x1, int windingRule, bool invert, float *out) const {
    WalkRow(cells_->cells, y, x0, x1, CoverageRule(windingRule == ShapeWindingEvenOdd, invert),
            [&](int from, int to, float v) { std::fill(out + (from - x0), out + (to - x0), v); });
}

void ShapeCoverage::Band::SweepSpans(int y, int x0, int x1, int windingRule, float *out,
                                     std::vector<std::pair<int, int>> &spans) const {
    spans.clear();
    WalkRow(cells_->cells, y, x0, x1, CoverageRule(windingRule == ShapeWindingEvenOdd, false),
            [&](int from, int to, float v) {
                if (v <= 0.0f) return;
                std::fill(out + (from - x0), out + (to - x0), v);
                if (!spans.empty() && spans.back().second == from)
                    spans.back().second = to;
                else
                    spans.emplace_back(from, to);
            });
}

bool ShapeRasterizerInputs::Rasterize(Request *req, const Shape &shape, Image *mask, bool invert,
                                      int windingRule) const {
    if (!mask || !mask->IsMask()) return false;
    const ImgRectI win = mask->DataWindow();
    if (mask->IsNoData() || win.IsNull()) return true;
    if (!mask->AllocScanLineData()) return false;
    const double xScale = mask->Width();
    ShapeCoverage coverage(xScale, xScale * mask->XScale() / mask->YScale());
    try {
        coverage.Add(shape, false);
    } catch (const std::bad_alloc &) {
        return false;
    }
    const RenderTask *task = req ? req->GetTask() : nullptr;
    const int depth = mask->Depth(), width = win.Width();
    std::atomic<bool> failed{false};
    auto band = [&](int b) {
        const ImgRectI box(win.x0, win.y0 + b * kBandRows, win.x1, std::min(win.y0 + (b + 1) * kBandRows, win.y1));
        try {
            ShapeCoverage::Band cells;
            if (!cells.Build(coverage, box)) {
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
                cells.Sweep(y, win.x0, win.x1, windingRule, invert, out);
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
