// Masks from shapes at UHD into a one-channel float32 frame (its rows already
// allocated, as a mask tool's image has them by then): a filled ellipse, a
// closed polygon of 200 Bezier points (flattened on the way in), and the
// stroke of the ellipse (outline and scan conversion). BM_CopyFloorAFlt32
// (CopyBench.cpp) is the floor to read them against.
//
// Shape trees: 1,000 filled and stroked stars drawn into a UHD RGBA float32
// frame (combining on and off), the boolean union of 200 circles, and sRender
// of a long Bezier path beside Cairo (python3-cairo, bench/peers/
// cairo_render.py) drawing the same path: time per frame for both and the
// mean absolute difference of the two alphas. BM_CopyFloor (CopyBench.cpp),
// a new UHD RGBA float32 frame copied, is their floor.
#include <cmath>
#include <fstream>
#include <numbers>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/shape/Shape.h"
#include "host/shape/ShapeOperator.h"
#include "host/shape/ShapeRasterizer.h"
#include "host/shape/ShapeTree.h"
#include "host/shape/ShapeTreeRenderer.h"

namespace Orvane::Bench {
namespace {

constexpr double kAspect = double(kHeight) / kWidth;

Ref<Image> MaskFrame() {
    Ref<Image> mask = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthAFlt32}});
    mask->AllocScanLineData();
    return mask;
}

/// The ellipse as the ellipse mask builds it: points every quarter pixel of its radius.
Ref<Shape> Ellipse() {
    const double hw = 0.3, hh = 0.2;
    const int n = static_cast<int>(4 * std::hypot(hw * kWidth, hh * kWidth));
    Ref<Shape> s = MakeRef<Shape>();
    for (int i = 0; i < n; ++i) {
        const double a = 2 * std::numbers::pi * i / n;
        const double x = 0.5 + hw * std::cos(a), y = kAspect / 2 + hh * std::sin(a);
        i == 0 ? s->MoveTo(x, y) : s->LineTo(x, y);
    }
    s->Close();
    return s;
}

/// A closed curve of `n` Bezier pieces through the points (0.5 + sx r cos a, aspect / 2 + r sin a) at
/// a = turns x 2 pi i / n, with handles along the tangent a third of a step long; radius(a, r, dr) gives r and
/// dr / da.
template <class Radius> Ref<Shape> PolarBezierCurve(int n, double turns, double sx, Radius radius) {
    auto point = [&](int i, double &x, double &y, double &tx, double &ty) {
        const double a = turns * 2 * std::numbers::pi * i / n;
        double r, dr;
        radius(a, r, dr);
        x = 0.5 + sx * r * std::cos(a);
        y = kAspect / 2 + r * std::sin(a);
        const double step = turns * 2 * std::numbers::pi / n / 3;
        tx = sx * (dr * std::cos(a) - r * std::sin(a)) * step;
        ty = (dr * std::sin(a) + r * std::cos(a)) * step;
    };
    Ref<Shape> s = MakeRef<Shape>();
    double x, y, tx, ty;
    point(0, x, y, tx, ty);
    s->MoveTo(x, y);
    for (int i = 1; i <= n; ++i) {
        double x1, y1, tx1, ty1;
        point(i % n, x1, y1, tx1, ty1);
        s->BezierTo(x + tx, y + ty, x1 - tx1, y1 - ty1, x1, y1);
        x = x1, y = y1, tx = tx1, ty = ty1;
    }
    s->Close();
    return s;
}

/// A wavy closed curve of 200 Bezier points with smooth handles.
Ref<Shape> BezierPolygon() {
    return PolarBezierCurve(200, 1, 1, [](double a, double &r, double &dr) {
        r = 0.22 + 0.04 * std::sin(7 * a);
        dr = 0.28 * std::cos(7 * a);
    });
}

void RasterizeLoop(benchmark::State &state, const Shape &shape) {
    Ref<Image> mask = MaskFrame();
    const ShapeRasterizerInputs ras(nullptr);
    for (auto _ : state) {
        if (!ras.Rasterize(nullptr, shape, mask.Get(), false, ShapeWindingNonZero)) state.SkipWithError("failed");
        benchmark::DoNotOptimize(mask.Get());
    }
    ReportPixels(state);
}

void BM_ShapeFilledEllipse(benchmark::State &state) { RasterizeLoop(state, *Ellipse()); }
BENCHMARK(BM_ShapeFilledEllipse)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ShapeBezierPolygon200(benchmark::State &state) { RasterizeLoop(state, *BezierPolygon()); }
BENCHMARK(BM_ShapeBezierPolygon200)->UseRealTime()->Unit(benchmark::kMillisecond);

/// The ellipse's stroke, 20 pixels wide, round joins, at the masks' tolerance of 2/W: outline and scan conversion.
void BM_ShapeStrokedEllipse(benchmark::State &state) {
    const Ref<Shape> ellipse = Ellipse();
    Ref<Image> mask = MaskFrame();
    const ShapeRasterizerInputs ras(nullptr);
    const TagList tags{{ShapeJoin, ShapeJoinRound}, {ShapeTolerance, 2.0 / kWidth}};
    for (auto _ : state) {
        const Ref<Shape> stroke = ellipse->OutlineOfShapeTagList(20.0 / kWidth, tags);
        if (!ras.Rasterize(nullptr, *stroke, mask.Get(), false, ShapeWindingNonZero)) state.SkipWithError("failed");
        benchmark::DoNotOptimize(mask.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_ShapeStrokedEllipse)->UseRealTime()->Unit(benchmark::kMillisecond);

/// The outline alone, to tell its share of the stroke.
void BM_ShapeOutlineOnly(benchmark::State &state) {
    const Ref<Shape> ellipse = Ellipse();
    const TagList tags{{ShapeJoin, ShapeJoinRound}, {ShapeTolerance, 2.0 / kWidth}};
    for (auto _ : state) benchmark::DoNotOptimize(ellipse->OutlineOfShapeTagList(20.0 / kWidth, tags).Get());
}
BENCHMARK(BM_ShapeOutlineOnly)->UseRealTime()->Unit(benchmark::kMillisecond);

// ---- shape trees ----

Ref<ShapeNode> NodeOf(Ref<Shape> shape, const ShapeStyle &style) {
    Ref<ShapeNode> n = MakeRef<ShapeNode>();
    n->SetShape(std::move(shape));
    n->SetStyle(style);
    return n;
}

/// Five-pointed stars (inner radius 0.4 of the outer), spread over the frame, each scaled and turned at random
/// (a fixed seed), all in one style: a fill and a 3-pixel mitred line.
Ref<ShapeTree> Stars(int count) {
    std::mt19937 rng(7);
    std::uniform_real_distribution<double> unit(0.0, 1.0);
    ShapeStyle style;
    style.fillColor[0] = 0.9f, style.fillColor[1] = 0.7f, style.fillColor[2] = 0.1f, style.fillColor[3] = 0.8f;
    style.line = true, style.lineWidth = 3.0 / kWidth;
    Ref<ShapeTree> tree = MakeRef<ShapeTree>();
    for (int k = 0; k < count; ++k) {
        const double cx = unit(rng), cy = unit(rng) * kAspect, r = (20 + 100 * unit(rng)) / kWidth;
        const double turn = 2 * std::numbers::pi * unit(rng);
        Ref<Shape> star = MakeRef<Shape>();
        for (int i = 0; i < 10; ++i) {
            const double a = turn + std::numbers::pi * i / 5, ri = i % 2 ? 0.4 * r : r;
            i ? star->LineTo(cx + ri * std::cos(a), cy + ri * std::sin(a))
              : star->MoveTo(cx + ri * std::cos(a), cy + ri * std::sin(a));
        }
        star->Close();
        tree->Root().AppendChild(NodeOf(star, style));
    }
    return tree;
}

Ref<Image> UhdRgbaFrame() {
    return NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthRGBAFlt32}});
}

/// 1,000 stars into a new UHD frame (arg 1: consecutive nodes of one style combined; 0: drawn one by one).
void BM_ShapeTreeStars1000(benchmark::State &state) {
    const Ref<ShapeTree> tree = Stars(1000);
    ShapeTreeRenderer renderer;
    renderer.SetCombine(state.range(0) != 0);
    for (auto _ : state) {
        Ref<Image> frame = UhdRgbaFrame();
        if (!renderer.Render(nullptr, *tree, frame.Get())) state.SkipWithError("failed");
        benchmark::DoNotOptimize(frame.Get());
    }
    ReportPixels(state);
}
BENCHMARK(BM_ShapeTreeStars1000)->Arg(1)->Arg(0)->UseRealTime()->Unit(benchmark::kMillisecond);

/// The boolean union of 200 overlapping Bezier circles, flattened for a UHD frame (arg 1: each circle first made
/// the region it fills, as sBoolean does; 0: the flattened circles straight into one union).
void BM_ShapeUnion200Circles(benchmark::State &state) {
    std::mt19937 rng(11);
    std::uniform_real_distribution<double> unit(0.0, 1.0);
    ShapeTree tree;
    constexpr double k = 0.5522847498; // a quarter circle's control arm over the radius
    for (int i = 0; i < 200; ++i) {
        const double cx = 0.1 + 0.8 * unit(rng), cy = (0.1 + 0.8 * unit(rng)) * kAspect, r = 0.02 + 0.06 * unit(rng);
        Ref<Shape> c = MakeRef<Shape>();
        c->MoveTo(cx + r, cy);
        c->BezierTo(cx + r, cy + k * r, cx + k * r, cy + r, cx, cy + r);
        c->BezierTo(cx - k * r, cy + r, cx - r, cy + k * r, cx - r, cy);
        c->BezierTo(cx - r, cy - k * r, cx - k * r, cy - r, cx, cy - r);
        c->BezierTo(cx + k * r, cy - r, cx + r, cy - k * r, cx + r, cy);
        c->Close();
        tree.Root().AppendChild(NodeOf(c, ShapeStyle()));
    }
    size_t contours = 0;
    for (auto _ : state) {
        ClipPaths united;
        ShapeOperator::AddShapeUnionToPaths(tree, united, 2.0 / kWidth, state.range(0) != 0);
        contours = united.size();
        benchmark::DoNotOptimize(united.data());
    }
    state.counters["contours"] = static_cast<double>(contours);
}
BENCHMARK(BM_ShapeUnion200Circles)->Arg(1)->Arg(0)->UseRealTime()->Unit(benchmark::kMillisecond);

/// Hands sRender a fixed tree (the benchmark's own source tool).
class TreeSource : public ThreadedOperator {
public:
    TreeSource(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_ShapeTree}, {LinkMain, 1}});
    }
    void Process(Request *req) override { req->SetOutputData(output_, tree.Get()); }
    Ref<ShapeTree> tree;

private:
    Output *output_;
};

Object *MakeTreeSource(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new TreeSource(reg, args, tags);
}

/// A long closed path of 2,000 Bezier curves: three turns of a wavy loop about the centre, so that it crosses
/// itself and the non-zero rule has windings up to 3. Points in shape units.
Ref<Shape> LongBezierPath() {
    constexpr double turns = 3, grow = 0.03 / (turns * 2 * std::numbers::pi); // 0.03 over the three turns
    return PolarBezierCurve(2000, turns, 1.6, [](double a, double &r, double &dr) {
        r = 0.12 + 0.05 * std::sin(a * 17.0 / 3) + grow * a;
        dr = 0.05 * 17.0 / 3 * std::cos(a * 17.0 / 3) + grow;
    });
}

/// The path for the peer in its pixels (rows from the top): "M x y", "C x1 y1 x2 y2 x y" and "Z" lines.
std::string PathText(const Shape &shape) {
    std::ostringstream out;
    out.precision(17);
    const auto px = [&](double x, double y) { out << ' ' << x * kWidth << ' ' << kHeight - y * kWidth; };
    for (const Shape::SubPath &sp : shape.SubPaths()) {
        out << 'M';
        px(sp.points[0].x, sp.points[0].y);
        out << '\n';
        for (size_t i = 1; i < sp.points.size(); ++i) {
            const bool curve = sp.points[i].control;
            out << (curve ? 'C' : 'L');
            for (size_t j = i; j < i + (curve ? 3 : 1); ++j) px(sp.points[j].x, sp.points[j].y);
            out << '\n';
            if (curve) i += 2;
        }
        if (sp.closed) out << "Z\n";
    }
    return out.str();
}

/// Runs the peer on `path`: fills `alpha` (rows from the bottom, as ours) and its seconds per frame; false with
/// `why` when it cannot.
bool RunCairo(const std::string &pathFile, const ShapeStyle &style, std::vector<uint8_t> &alpha, double &seconds,
              std::string &why) {
    const char *python = "/usr/bin/python3";
    std::string out;
    if (CapturePeer(std::string(python) + " -c 'import cairo'", out) != 0) {
        why = "peer skipped: python3-cairo is missing (scripts/setup-bench-peers.sh installs it)";
        return false;
    }
    const std::string pgm = PeerOutput(".pgm");
    std::ostringstream cmd;
    cmd << python << " " << ORVANE_SOURCE_DIR << "/bench/peers/cairo_render.py " << pathFile << " " << pgm << " "
        << kWidth << " " << kHeight << " 5 " << style.lineWidth * kWidth << " " << style.miterLimit;
    for (const float *c : {style.fillColor, style.lineColor})
        for (int i = 0; i < 4; ++i) cmd << " " << c[i];
    if (CapturePeer(cmd.str(), out) != 0) {
        why = "peer failed: " + out;
        return false;
    }
    const size_t at = out.find("seconds_per_frame ");
    std::ifstream file(pgm, std::ios::binary);
    std::string magic;
    int w = 0, h = 0, maxval = 0;
    file >> magic >> w >> h >> maxval;
    file.get();
    alpha.assign(static_cast<size_t>(kWidth) * kHeight, 0);
    if (at == std::string::npos || magic != "P5" || w != kWidth || h != kHeight || maxval != 255 ||
        !file.read(reinterpret_cast<char *>(alpha.data()), static_cast<std::streamsize>(alpha.size()))) {
        why = "peer gave no picture";
        return false;
    }
    seconds = std::stod(out.substr(at + 18));
    return true;
}

/// sRender of LongBezierPath, filled (translucent) and stroked (6 pixels, mitred), into a UHD float32 frame.
/// The row's time is ours per frame; counters peer_ms_per_frame (Cairo's fill and stroke calls alone, into its
/// 8-bit ARGB surface) and alpha_mad, the mean absolute difference of the two alphas over the frame.
void BM_ShapeRenderLongPath(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    static const Registry *row = [] {
        TagList tags{{RegConstructor, &MakeTreeSource},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)},
                     {RegName, "Benchmark Shape Tree"},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1}};
        return Registry::_Init(&ClassRegistry, OvID("BenchShapeTree"), tags);
    }();
    OrvaneDoc doc;
    auto *source = row ? dynamic_cast<TreeSource *>(doc.AddTool(OvID("BenchShapeTree"))) : nullptr;
    Operator *render = doc.AddTool(OvID("sRender"));
    if (!source || !render || !render->FindInput("Input")->ConnectTo(source->FindMainOutput())) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    for (const auto &[id, value] : {std::pair{"Width", double(kWidth)}, {"Height", double(kHeight)}, {"Depth", 4.0}})
        render->FindInput(id)->SetValue(MakeRef<Number>(value));
    ShapeStyle style;
    style.fillColor[0] = 0.2f, style.fillColor[1] = 0.5f, style.fillColor[2] = 0.9f, style.fillColor[3] = 0.7f;
    style.lineColor[0] = 1.0f, style.lineColor[1] = 0.8f, style.lineColor[2] = 0.1f, style.lineColor[3] = 1.0f;
    style.line = true, style.lineWidth = 6.0 / kWidth, style.join = ShapeJoinMiter;
    const Ref<Shape> path = LongBezierPath();
    source->tree = MakeRef<ShapeTree>();
    source->tree->Root().AppendChild(NodeOf(path, style));

    RenderLoop(state, render); // the row's time is ours per frame
    EvalOptions options;
    options.useCache = false;
    const Ref<Parameter> out = Evaluate(render->FindMainOutput(), 0.0, options);
    const auto *ours = dynamic_cast<const Image *>(out.Get());
    const std::string pathFile = PeerOutput(".path");
    std::ofstream(pathFile) << PathText(*path);
    std::vector<uint8_t> alpha;
    double peerSeconds = 0.0;
    std::string why;
    if (!ours || !RunCairo(pathFile, style, alpha, peerSeconds, why)) {
        state.SetLabel(ours ? why : "no picture of ours");
        return;
    }
    double diff = 0.0;
    for (int y = 0; y < kHeight; ++y) {
        const float *rowPx = ours->Row<float>(y);
        const uint8_t *peer = alpha.data() + static_cast<size_t>(kHeight - 1 - y) * kWidth;
        for (int x = 0; x < kWidth; ++x) diff += std::abs(rowPx[4 * x + 3] - peer[x] / 255.0);
    }
    state.counters["peer_ms_per_frame"] = 1e3 * peerSeconds;
    state.counters["alpha_mad"] = diff / (double(kWidth) * kHeight);
}
BENCHMARK(BM_ShapeRenderLongPath)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
