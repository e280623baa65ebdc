// ShapeTreeRenderer::Render: the tree becomes a list of drawings (a fill or a
// line each, in drawing order: shapes placed in pixels, a premultiplied
// colour, a pixel box), made once with the nodes spread over the workers;
// then each band of rows composites, in order, the drawings whose boxes
// reach it.
#include "host/shape/ShapeTreeRenderer.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <functional>
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

/// A drawn node and what its drawings cover: its shape flattened (with a fill) and its stroke (with a line).
struct NodeShapes {
    const ShapeNode *node;
    Ref<const Shape> fill, line;
};

/// A run of consecutive nodes drawn together (one node when not combining): nodes [first, first + count).
struct DrawRun {
    size_t first, count;
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

/// Flattens and strokes the node's shape, in steps of one pixel (what the coverage would flatten to).
void ShapesOfNode(NodeShapes &ns, double xScale, double yScale) {
    const Shape &shape = *ns.node->GetShape();
    const ShapeStyle &style = ns.node->Style();
    const double tolerance = 1.0 / std::max(xScale, yScale);
    if (style.fill)
        ns.fill = shape.IsFlat() ? ns.node->ShapeRef()
                                 : Ref<const Shape>(shape.FlattenOfShapeTagList({{ShapeTolerance, tolerance}}));
    if (style.line && style.lineWidth > 0.0 && std::isfinite(style.lineWidth))
        ns.line = shape.OutlineOfShapeTagList(style.lineWidth, {{ShapeJoin, style.join},
                                                                {ShapeCap, style.cap},
                                                                {ShapeMiterLimit, style.miterLimit},
                                                                {ShapeTolerance, tolerance}});
}

/// Makes the run's fill and line drawings from its nodes' shapes: those that show in `win`, each cut to `area`.
void PrepareDrawRun(DrawRun &run, const NodeShapes *nodes, const ImgRectI &area, const ImgRectI &win, double xScale,
                    double yScale) {
    const ShapeStyle &style = nodes[run.first].node->Style();
    const auto make = [&](NodeDrawing &d, Ref<const Shape> NodeShapes::*part, const float *rgba) {
        d.colour = PremultipliedColour(rgba, style.opacity);
        if (d.colour.A <= 0.0f) return; // draws nothing
        d.coverage = std::make_unique<ShapeCoverage>(xScale, yScale);
        for (size_t i = run.first; i < run.first + run.count; ++i)
            if (const Shape *shape = (nodes[i].*part).Get()) d.coverage->Add(*shape, run.count > 1);
        d.box = d.coverage->PixelBox() & area;
        if ((d.box & win).IsNull()) d.coverage.reset();
    };
    make(run.fill, &NodeShapes::fill, style.fillColor);
    make(run.line, &NodeShapes::line, style.lineColor);
}

/// Lays `d` over `n` pixels whose coverage is `cov`.
void CompositeOver(const NodeDrawing &d, const float *cov, int n, FltPixel *px) {
    const FltPixel c = d.colour;
    for (int i = 0; i < n; ++i) {
        const float k = cov[i];
        const float keep = 1.0f - c.A * k;
        FltPixel &p = px[i];
        p.R = c.R * k + p.R * keep;
        p.G = c.G * k + p.G * keep;
        p.B = c.B * k + p.B * keep;
        p.A = c.A * k + p.A * keep;
    }
}

} // namespace

bool ShapeTreeRenderer::Render(Request *req, const ShapeTree &tree, Image *image) const {
    if (!image || image->IsMask()) return false;
    const ImgRectI win = image->DataWindow();
    if (image->IsNoData() || win.IsNull()) return true;
    // Fresh rows come zeroed (PixelMemory.h): clearing them again would cost a pass over the frame.
    const bool zeroed = !image->HasScanLineData();
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

    std::vector<NodeShapes> nodes;
    std::vector<DrawRun> runs;
    try {
        std::vector<const ShapeNode *> drawn;
        GatherDrawnNodes(tree.Root(), drawn);
        for (const ShapeNode *node : drawn) {
            if (!NodeTouchesWindow(*node, win, xScale, yScale)) continue;
            if (combine_ && !runs.empty() && node->Style().CanCombine(nodes[runs.back().first].node->Style()))
                ++runs.back().count;
            else
                runs.push_back({nodes.size(), 1, {}, {}});
            nodes.push_back({node, nullptr, nullptr});
        }
    } catch (const std::bad_alloc &) {
        return false;
    }
    // Nodes first, each by itself, so that a long run of combined nodes still spreads over the workers.
    const auto inParallel = [&](size_t count, const std::function<void(size_t)> &fn) {
        ParallelFor(static_cast<int>(count), [&](int i) {
            if (stop()) return;
            try {
                fn(static_cast<size_t>(i));
            } catch (const std::bad_alloc &) {
                failed = true;
            }
        });
    };
    inParallel(nodes.size(), [&](size_t i) { ShapesOfNode(nodes[i], xScale, yScale); });
    // Edges are cut only at the bands' rows, fixed in the image, and at the sides of the frame (or of a wider
    // window): a cut moves the edge by up to half a step of the cell grid, so a window within the frame, or a
    // field's rows, then get the same bits as the whole frame.
    const auto bandOf = [](int y) {
        return y >= 0 ? y / kRenderBandRows : -((kRenderBandRows - 1 - y) / kRenderBandRows);
    };
    const int firstBand = bandOf(win.y0), lastBand = bandOf(win.y1 - 1);
    const ImgRectI sides = win | ImgRectI(0, 0, image->Width(), image->Height());
    const ImgRectI area(sides.x0, firstBand * kRenderBandRows, sides.x1, (lastBand + 1) * kRenderBandRows);
    inParallel(runs.size(), [&](size_t i) { PrepareDrawRun(runs[i], nodes.data(), area, win, xScale, yScale); });
    if (failed) return false;
    std::vector<const NodeDrawing *> drawings;
    for (const DrawRun &run : runs)
        for (const NodeDrawing *d : {&run.fill, &run.line})
            if (d->coverage) drawings.push_back(d);

    const int depth = image->Depth(), width = win.Width();
    const bool direct = depth == DepthRGBAFlt32; // the image's rows are the working pixels
    ParallelFor(lastBand - firstBand + 1, [&](int b) {
        const int bandY0 = (firstBand + b) * kRenderBandRows;
        const ImgRectI rows = ImgRectI(area.x0, bandY0, area.x1, bandY0 + kRenderBandRows); // where edges are cut
        const ImgRectI band = rows & win;                                                   // what is drawn
        try {
            std::vector<FltPixel> buffer(direct ? 0 : static_cast<size_t>(width) * band.Height());
            const auto row = [&](int y) {
                return direct ? image->Row<FltPixel>(y) : buffer.data() + static_cast<size_t>(y - band.y0) * width;
            };
            // The band buffer starts transparent; the image's own rows may need clearing.
            if (direct && !zeroed)
                for (int y = band.y0; y < band.y1; ++y) std::fill_n(row(y), width, FltPixel{});
            std::vector<float> cov(static_cast<size_t>(width));
            std::vector<std::pair<int, int>> spans;
            ShapeCoverage::Band cells;
            for (const NodeDrawing *d : drawings) {
                const ImgRectI cut = d->box & rows, box = cut & band;
                if (box.IsNull()) continue;
                if (stop() || !cells.Build(*d->coverage, cut)) {
                    failed = true;
                    return;
                }
                for (int y = box.y0; y < box.y1; ++y) {
                    cells.SweepSpans(y, box.x0, box.x1, ShapeWindingNonZero, cov.data(), spans);
                    for (const auto &[from, to] : spans)
                        CompositeOver(*d, cov.data() + (from - box.x0), to - from, row(y) + (from - win.x0));
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
