// ShapeTreeRenderer::Render: the tree becomes a list of drawings (a fill or a
// line each, in drawing order: shapes placed in pixels, a premultiplied
// colour, a pixel box), made once with the nodes spread over the workers;
// then each band of rows composites, in order, the drawings whose boxes
// reach it.
#include "host/shape/ShapeTreeRenderer.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <memory>
#include <new>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/shape/ShapeRasterizer.h"
#include "host/shape/ShapeTree.h"

namespace Orvane {

namespace {

/// Rows per band: fixed, so that the work (and the bits) never depend on the number of workers.
constexpr int kRenderBandRows = 32;

/// One fill or line: what it covers and the premultiplied colour it lays there at full coverage.
struct NodeDrawing {
    std::unique_ptr<ShapeCoverage> coverage;
    FltPixel colour;
    ImgRectI box; ///< the pixels it may touch, within the data window
};

/// A run of consecutive nodes drawn together (one node when not combining).
struct DrawRun {
    std::vector<const ShapeNode *> nodes;
    NodeDrawing fill, line;
};

void GatherDrawnNodes(const ShapeNode &node, std::vector<const ShapeNode *> &out) {
    if (node.GetShape() && !node.GetShape()->IsEmpty()) out.push_back(&node);
    for (const Ref<ShapeNode> &c : node.Children()) GatherDrawnNodes(*c, out);
}

/// The colour `rgba` (straight) at `opacity`, premultiplied; values without meaning count as 0.
FltPixel PremultipliedColour(const float *rgba, double opacity) {
    const auto finite = [](double v) { return std::isfinite(v) ? v : 0.0; };
    const double a = std::clamp(finite(rgba[3]), 0.0, 1.0) * std::clamp(finite(opacity), 0.0, 1.0);
    return {static_cast<float>(finite(rgba[0]) * a), static_cast<float>(finite(rgba[1]) * a),
            static_cast<float>(finite(rgba[2]) * a), static_cast<float>(a)};
}

/// Whether the node, grown by its style's reach, can touch the data window `win` (pixel units per shape unit
/// `xScale`, `yScale`).
bool NodeTouchesWindow(const ShapeNode &node, const ImgRectI &win, double xScale, double yScale) {
    const ImgRectF &b = node.Bounds();
    const double reach = node.Style().Reach();
    if (b.IsEmpty()) return false;
    const double x0 = (b.x0 - reach) * xScale, x1 = (b.x1 + reach) * xScale;
    const double y0 = (b.y0 - reach) * yScale, y1 = (b.y1 + reach) * yScale;
    // Non-finite bounds (or reach) leave it to the coverage, which drops what has no place.
    if (!std::isfinite(x0 + x1 + y0 + y1)) return true;
    return x1 >= win.x0 && x0 <= win.x1 && y1 >= win.y0 && y0 <= win.y1;
}

/// Makes the run's fill and line drawings.
void PrepareDrawRun(DrawRun &run, const ImgRectI &win, double xScale, double yScale) {
    const ShapeStyle &style = run.nodes.front()->Style();
    const auto finish = [&](NodeDrawing &d, const float *rgba) {
        d.colour = PremultipliedColour(rgba, style.opacity);
        d.box = d.coverage->PixelBox() & win;
        if (d.colour.A <= 0.0f || d.box.IsNull()) d.coverage.reset(); // draws nothing
    };
    if (style.fill) {
        run.fill.coverage = std::make_unique<ShapeCoverage>(xScale, yScale);
        for (const ShapeNode *node : run.nodes) run.fill.coverage->Add(*node->GetShape(), run.nodes.size() > 1);
        finish(run.fill, style.fillColor);
    }
    if (style.line && style.lineWidth > 0.0 && std::isfinite(style.lineWidth)) {
        // The stroke flattened as the fill is: steps of one pixel.
        const TagList tags{{ShapeJoin, style.join},
                           {ShapeCap, style.cap},
                           {ShapeMiterLimit, style.miterLimit},
                           {ShapeTolerance, 1.0 / std::max(xScale, yScale)}};
        run.line.coverage = std::make_unique<ShapeCoverage>(xScale, yScale);
        for (const ShapeNode *node : run.nodes) {
            const Ref<Shape> stroke = node->GetShape()->OutlineOfShapeTagList(style.lineWidth, tags);
            if (stroke) run.line.coverage->Add(*stroke, run.nodes.size() > 1);
        }
        finish(run.line, style.lineColor);
    }
}

/// Lays `d` over `n` pixels whose coverage is `cov`.
void CompositeOver(const NodeDrawing &d, const float *cov, int n, FltPixel *px) {
    const FltPixel c = d.colour;
    for (int i = 0; i < n; ++i) {
        const float k = cov[i];
        if (k <= 0.0f) continue;
        const float keep = 1.0f - c.A * k;
        FltPixel &p = px[i];
        p.R = c.R * k + p.R * keep;
        p.G = c.G * k + p.G * keep;
        p.B = c.B * k + p.B * keep;
        p.A = c.A * k + p.A * keep;
    }
}

} // namespace

bool ShapeTreeRenderer::Render(Request *req, const ShapeTree &tree, Image *image, bool clear) const {
    if (!image || image->IsMask()) return false;
    const ImgRectI win = image->DataWindow();
    if (image->IsNoData() || win.IsNull()) return true;
    if (!image->AllocScanLineData()) return false;
    const double xScale = image->Width();
    const double yScale = xScale * image->XScale() / image->YScale();
    const RenderTask *task = req ? req->GetTask() : nullptr;
    std::atomic<bool> failed{false};
    const auto stop = [&] {
        if (!failed.load(std::memory_order_relaxed) && ((task && task->IsAborted()) || image->CheckAbort()))
            failed = true;
        return failed.load(std::memory_order_relaxed);
    };

    std::vector<DrawRun> runs;
    try {
        std::vector<const ShapeNode *> drawn;
        GatherDrawnNodes(tree.Root(), drawn);
        for (const ShapeNode *node : drawn) {
            if (!NodeTouchesWindow(*node, win, xScale, yScale)) continue;
            if (combine_ && !runs.empty() && node->Style().CanCombine(runs.back().nodes.front()->Style()))
                runs.back().nodes.push_back(node);
            else
                runs.emplace_back().nodes.push_back(node);
        }
    } catch (const std::bad_alloc &) {
        return false;
    }
    ParallelFor(static_cast<int>(runs.size()), [&](int i) {
        if (stop()) return;
        try {
            PrepareDrawRun(runs[static_cast<size_t>(i)], win, xScale, yScale);
        } catch (const std::bad_alloc &) {
            failed = true;
        }
    });
    if (failed) return false;
    std::vector<const NodeDrawing *> drawings;
    for (const DrawRun &run : runs)
        for (const NodeDrawing *d : {&run.fill, &run.line})
            if (d->coverage) drawings.push_back(d);

    const int depth = image->Depth(), width = win.Width();
    const bool direct = depth == DepthRGBAFlt32; // the image's rows are the working pixels
    ParallelFor((win.Height() + kRenderBandRows - 1) / kRenderBandRows, [&](int b) {
        const ImgRectI band(win.x0, win.y0 + b * kRenderBandRows, win.x1,
                            std::min(win.y0 + (b + 1) * kRenderBandRows, win.y1));
        try {
            std::vector<FltPixel> buffer(direct ? 0 : static_cast<size_t>(width) * band.Height());
            const auto row = [&](int y) {
                return direct ? image->Row<FltPixel>(y) : buffer.data() + static_cast<size_t>(y - band.y0) * width;
            };
            for (int y = band.y0; y < band.y1; ++y) {
                if (clear)
                    std::fill_n(row(y), width, FltPixel{});
                else if (!direct)
                    LoadFlt(depth, image->ScanLine(y), width, row(y));
            }
            std::vector<float> cov(static_cast<size_t>(width));
            ShapeCoverage::Band cells;
            for (const NodeDrawing *d : drawings) {
                const ImgRectI box = d->box & band;
                if (box.IsNull()) continue;
                if (stop() || !cells.Build(*d->coverage, box)) {
                    failed = true;
                    return;
                }
                for (int y = box.y0; y < box.y1; ++y) {
                    cells.Sweep(y, box.x0, box.x1, ShapeWindingNonZero, false, cov.data());
                    CompositeOver(*d, cov.data(), box.Width(), row(y) + (box.x0 - win.x0));
                }
            }
            if (!direct)
                for (int y = band.y0; y < band.y1; ++y) StoreFlt(depth, row(y), width, image->ScanLine(y));
        } catch (const std::bad_alloc &) {
            failed = true;
        }
    });
    return !failed.load();
}

} // namespace Orvane
