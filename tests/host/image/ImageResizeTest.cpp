// Resizing and whole-factor shrinking against a direct convolution in double written here from the filters'
// formulas, with its own edge handling; hand-computed borders pin the edge policies down.
#include <optional>
#include <tuple>

#include "host/image/Resample.h"
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::imgresizetest {
namespace {
using namespace ::Orvane::Test;

constexpr int kAllFilters[] = {RszNearest,  RszBox,      RszLinear,  RszQuadratic, RszCubic, RszCatmullRom,
                               RszGaussian, RszMitchell, RszLanczos, RszSinc,      RszBessel};
constexpr int kWindows[] = {RszWindowHanning, RszWindowHamming, RszWindowBlackman, RszWindowKaiser};
constexpr int kEdges[] = {EdgeCanvas, EdgeWrap, EdgeDuplicate, EdgeMirror};

/// Normalised weights of source samples (before any edge policy) for output sample o.
std::vector<std::pair<int, double>> RefWeights(int filter, int window, double scale, double offset, int o) {
    const double u = (o + 0.5 - offset) / scale, stretch = std::max(1.0, 1.0 / scale);
    std::vector<std::pair<int, double>> w;
    if (filter == RszNearest) return {{static_cast<int>(std::floor(u)), 1.0}};
    if (filter == RszBox) { // overlap of each pixel with the footprint
        const double a = u - stretch / 2, b = u + stretch / 2;
        for (int j = static_cast<int>(std::floor(a)); j < b; ++j)
            w.push_back({j, (std::min(b, j + 1.0) - std::max(a, double(j))) / (b - a)});
        return w;
    }
    const double reach = RefRadius(filter) * stretch;
    double sum = 0;
    for (int j = static_cast<int>(std::floor(u - reach)) - 1; j <= u + reach; ++j) {
        const double v = RefFilter(filter, window, (j + 0.5 - u) / stretch);
        if (v != 0) w.push_back({j, v}), sum += v;
    }
    for (auto &p : w) p.second /= sum;
    return w;
}

/// Where an index beyond [lo, hi) reads under an edge policy; none for the canvas.
std::optional<int> EdgeIndex(int j, int lo, int hi, int edges) {
    const int n = hi - lo, k = ((j - lo) % (2 * n) + 2 * n) % (2 * n);
    if (j >= lo && j < hi) return j;
    if (edges == EdgeWrap) return lo + k % n;
    if (edges == EdgeDuplicate) return j < lo ? lo : hi - 1;
    if (edges == EdgeMirror) return lo + (k < n ? k : 2 * n - 1 - k);
    return std::nullopt;
}

struct Request2D {
    int filter = RszLinear, window = RszWindowHanning;
    double sx = 1, sy = 1, ox = 0, oy = 0;
    int ex = EdgeDuplicate, ey = EdgeDuplicate;
    ImgRectI range; ///< the source window; null: frame joined with data window

    TagList Tags() const {
        TagList t{{ResizeFilter, filter}, {ResizeWindow, window}, {ResizeXScale, sx}, {ResizeYScale, sy},
                  {ResizeXOffset, ox},    {ResizeYOffset, oy},    {ResizeXEdges, ex}, {ResizeYEdges, ey}};
        if (!range.IsNull()) t.Set({ResizeSourceWindow, &range});
        return t;
    }
};

/// Whether `got` is the convolution in double of `src` by `r` (clamped for integer outputs) within `tol`.
::testing::AssertionResult Matches(const Image &got, const Image &src, const Request2D &r, double tol) {
    const ImgRectI range = r.range.IsNull() ? (src.Frame() | src.DataWindow()) : r.range;
    auto want = [&](int x, int y) {
        std::array<double, 4> acc{};
        for (auto [j, wy] : RefWeights(r.filter, r.window, r.sy, r.oy, y))
            for (auto [i, wx] : RefWeights(r.filter, r.window, r.sx, r.ox, x)) {
                const auto mi = EdgeIndex(i, range.x0, range.x1, r.ex), mj = EdgeIndex(j, range.y0, range.y1, r.ey);
                const FltPixel p = mi && mj ? src.GetFlt(*mi, *mj) : src.GetCanvasColor();
                for (int c = 0; c < 4; ++c) acc[c] += wx * wy * Channel(p, c);
            }
        for (double &v : acc) v = got.IsFloat() ? float(v) : std::clamp(float(v), 0.f, 1.f);
        return acc;
    };
    return AllNear(got, got.DataWindow(), tol, want, got.IsMask() ? 3 : 0);
}

/// What one stored component may differ by from an exact value (halves: near 1.5).
double Slack(int depth) { return Kind(depth) == 2 ? 1.5e-3 : HalfCode(depth, 0) + (Kind(depth) == 3 ? 2e-5 : 1e-5); }

TEST(ResizeFilters, SupportsFallBacksAndAxisTablesWhoseWeightsSumToOne) {
    // Values are held by the direct convolution; here the radius, and the interpolating filters' zeros.
    for (int filter : kAllFilters)
        for (int window : kWindows) {
            SCOPED_TRACE(testing::Message() << "filter " << filter << " window " << window);
            EXPECT_TRUE(ResizeFilterSupport(filter) == RefRadius(filter) &&
                        Image::GetResizeFilterSupport(filter) == RefRadius(filter));
            EXPECT_EQ(ResizeFilterValue(filter, window, RefRadius(filter) + 1e-9), 0.0);
            if (filter != RszLinear && filter != RszCatmullRom && filter != RszLanczos && filter != RszSinc) continue;
            for (int k = 0; k <= 4; ++k) EXPECT_NEAR(ResizeFilterValue(filter, window, k), k == 0, 1e-15) << k;
        }
    // Unknown numbers fall back to linear and Hanning.
    EXPECT_TRUE(ValidResizeFilter(0) == RszLinear && ValidResizeFilter(12) == RszLinear);
    EXPECT_EQ(ValidResizeWindow(99), RszWindowHanning);
    EXPECT_EQ(ResizeFilterValue(RszSinc, 104, 1.3), ResizeFilterValue(RszSinc, RszWindowHanning, 1.3));
    // Axis tables: weights sum to one, runs are even, impossible axes are refused.
    for (int filter : kAllFilters)
        for (double scale : {0.25, 1.0 / 3, 0.5, 1.0, 1.7, 4.0})
            for (int edges : {int(EdgeCanvas), int(EdgeDuplicate), EdgeRenormalise}) {
                SCOPED_TRACE(testing::Message() << "filter " << filter << " scale " << scale << " edges " << edges);
                const int src = 48, out = static_cast<int>(src * scale);
                ResampleAxis axis;
                ASSERT_TRUE(axis.Build({filter, RszWindowHanning, scale, 0.0, edges, 0, src}, 0, out));
                ASSERT_TRUE(axis.Count() == out && axis.Taps() % 2 == 0);
                for (int i = 0; i < out; ++i) {
                    ASSERT_TRUE(axis.Weights(i)[0] != 0.f && (i == 0 || axis.First(i) >= axis.First(i - 1))) << i;
                    double sum = 0.0;
                    for (int k = 0; k < axis.Taps(); ++k) {
                        const int j = axis.First(i) + k;
                        const double w = axis.Weights(i)[k];
                        sum += w;
                        ASSERT_TRUE(edges != EdgeRenormalise || w == 0 || (j >= 0 && j < src)) << "only the source";
                    }
                    EXPECT_NEAR(sum, 1.0, 1e-6) << i;
                }
            }
    ResampleAxis bad;
    for (auto [scale, offset, lo] :
         {std::tuple{0.0, 0.0, 0}, {NAN, 0.0, 0}, {1.0, INFINITY, 0}, {1.0, 0.0, 4}, {1.0, 3e9, 0}})
        EXPECT_FALSE(bad.Build({RszLinear, RszWindowHanning, scale, offset, EdgeDuplicate, lo, 4}, 0, 4))
            << scale << " " << offset << " " << lo;
    EXPECT_FALSE(bad.IsValid());
}

TEST(ResizeTagList, EveryFilterMatchesTheDirectConvolutionIdentityIsExactEdgesHold) {
    // Up, down, a whole shrink, unequal axes, and pure shifts: {sx, sy, ox, oy, width, height}.
    const double geometries[][6] = {{2.5, 0.4, 0, 0, 33, 4},
                                    {0.5, 0.5, 0, 0, 7, 5},
                                    {0.37, 1.6, 0.3, -0.6, 5, 15},
                                    {1, 1, 0.3, -1.7, 13, 9},
                                    {1.25, 0.8, -2, 1.5, 17, 8}};
    Ref<Image> src = PatternAt(13, 9, DepthRGBAFlt32, 11, nullptr, {0.2f, -0.1f, 0.4f, 0.6f});
    for (int filter : kAllFilters)
        for (int window : kWindows) {
            if (window != RszWindowHanning && filter != RszSinc && filter != RszBessel) continue;
            for (const auto &[sx, sy, ox, oy, w, h] : geometries) {
                const Request2D r{
                    filter, window, sx, sy, ox, oy, kEdges[(filter + window) % 4], kEdges[(filter + window + 1) % 4],
                    {}};
                Ref<Image> dst = Blank(int(w), int(h), DepthRGBAFlt32);
                ASSERT_TRUE(src->ResizeTagList(dst.Get(), r.Tags()));
                EXPECT_TRUE(Matches(*dst, *src, r, 2e-5))
                    << "filter " << filter << " window " << window << " scale " << sx << "x" << sy;
            }
        }
    for (int depth = 1; depth <= 8; ++depth)
        for (int filter : {RszNearest, RszBox, RszLinear, RszCatmullRom, RszLanczos, RszSinc})
            for (int edges : kEdges) {
                Ref<Image> src = PatternAt(13, 9, depth, 7), dst = Blank(13, 9, depth);
                ASSERT_TRUE(src->ResizeTagList(dst.Get(), {{ResizeFilter, filter},
                                                           {ResizeWindow, RszWindowBlackman},
                                                           {ResizeXEdges, edges},
                                                           {ResizeYEdges, edges}}));
                ASSERT_TRUE(SameBits(*dst, *src)) << "depth " << depth << " filter " << filter << " edges " << edges;
            }
    // A row a b c d shifted right by 1.5 pixels: output pixel 0 sits between source pixels -2 and -1, pixel 5
    // between 3 and 4, pixel 2 between a and b.
    const float v[4] = {0.1f, 0.2f, 0.4f, 0.8f};
    auto at = [&](int x, int y) { return FltPixel{v[x + y], v[x + y], v[x + y], v[x + y]}; };
    Ref<Image> row = Filled(4, 1, DepthAFlt32, at, nullptr, {0, 0, 0, 0.05f});
    const std::tuple<int, double, double> cases[] = {
        {EdgeCanvas, 0.05, (0.8 + 0.05) / 2},         // beyond the row: the canvas
        {EdgeWrap, (0.4 + 0.8) / 2, (0.8 + 0.1) / 2}, // -2 reads c, -1 reads d; 4 reads a
        {EdgeDuplicate, 0.1, 0.8},                    // the end pixels repeat
        {EdgeMirror, (0.2 + 0.1) / 2, 0.8},           // -1 reads a, -2 reads b; 4 reads d
    };
    for (const auto &[edges, at0, at5] : cases) {
        Ref<Image> dst = Blank(6, 1, DepthAFlt32);
        ASSERT_TRUE(row->ResizeTagList(dst.Get(), {{ResizeFilter, RszLinear},
                                                   {ResizeXScale, 1.0},
                                                   {ResizeXOffset, 1.5},
                                                   {ResizeXEdges, edges},
                                                   {ResizeYEdges, EdgeDuplicate}}));
        const double want[6] = {at0, 0, (0.1 + 0.2) / 2, 0, 0, at5};
        for (int x : {0, 2, 5}) EXPECT_NEAR(dst->GetFlt(x, 0).A, want[x], 1e-7) << edges << ": " << x;
    }
    // Vertically the same rules (a column, Mirror), and beyond the frame the table keeps reading by them.
    Ref<Image> col = Filled(1, 4, DepthRGBAFlt32, at);
    const ImgRectI all(-10, -10, 10, 17);
    Ref<Image> dst = Blank(1, 7, DepthRGBAFlt32, &all);
    ASSERT_TRUE(col->ResizeTagList(
        dst.Get(),
        {{ResizeFilter, RszNearest}, {ResizeYScale, 1.0}, {ResizeYOffset, 2.0}, {ResizeYEdges, EdgeMirror}}));
    const float want[8] = {0.4f, 0.2f, 0.1f, 0.1f, 0.2f, 0.4f, 0.8f, 0.8f}; // rows -3 .. 4 of the column, mirrored
    for (int y = -1; y < 7; ++y) EXPECT_FLOAT_EQ(dst->GetFlt(0, y).R, want[y + 1]) << y;
    EXPECT_FLOAT_EQ(dst->GetFlt(5, 3).R, want[4]); // columns repeat (Duplicate by default)
}

TEST(ResizeTagList, OffsetsSourceWindowsDataWindowsCanvasAndDepths) {
    Ref<Image> src = PatternAt(16, 12, DepthRGBAFlt32, 9);
    // Whole offsets at scale 1 move the pixels exactly.
    Ref<Image> moved = Blank(16, 12, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(moved.Get(), {{ResizeFilter, RszLanczos},
                                                 {ResizeXOffset, 3.0},
                                                 {ResizeYOffset, -2.0},
                                                 {ResizeXEdges, EdgeCanvas},
                                                 {ResizeYEdges, EdgeCanvas}}));
    EXPECT_TRUE(AllNear(*moved, moved->DataWindow(), 0, [&](int x, int y) { return src->GetFlt(x - 3, y + 2); }));
    // At scale 2 the offset counts in output pixels: offset 2 moves by one source pixel.
    Ref<Image> big = Blank(32, 24, DepthRGBAFlt32), bigShift = Blank(32, 24, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(big.Get(), {{ResizeFilter, RszCatmullRom}}));
    ASSERT_TRUE(src->ResizeTagList(bigShift.Get(), {{ResizeFilter, RszCatmullRom}, {ResizeXOffset, 2.0}}));
    EXPECT_TRUE(AllNear(*bigShift, ImgRectI(2, 0, 32, 24), 0, [&](int x, int y) { return big->GetFlt(x - 2, y); }));
    // A source window limits what is read.
    for (int filter : {RszLinear, RszLanczos, RszBox}) {
        const Request2D r{filter, RszWindowHanning, 1.5, 0.75, 0, 0, EdgeDuplicate, EdgeDuplicate, {3, 2, 11, 9}};
        Ref<Image> dst = Blank(24, 9, DepthRGBAFlt32);
        ASSERT_TRUE(src->ResizeTagList(dst.Get(), r.Tags()));
        EXPECT_TRUE(Matches(*dst, *src, r, 2e-5)) << filter;
    }
    // An endless window: no edge policy applies; beyond the data window is canvas, as with the Canvas policy.
    src->SetCanvasColor(FltPixel{0.5f, 0.25f, 0, 1});
    const ImgRectI endless(-DomainEndless, -DomainEndless, DomainEndless, DomainEndless), none;
    const TagList shift{{ResizeFilter, RszCatmullRom}, {ResizeXOffset, -3.0}, {ResizeYOffset, 2.5}};
    TagList viaWindowTags = shift, viaCanvasTags = shift;
    viaWindowTags.Set({ResizeSourceWindow, &endless});
    viaCanvasTags.Set({ResizeXEdges, EdgeCanvas});
    viaCanvasTags.Set({ResizeYEdges, EdgeCanvas});
    Ref<Image> viaWindow = Blank(21, 9, DepthRGBAFlt32), viaCanvas = Blank(21, 9, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(viaWindow.Get(), viaWindowTags));
    ASSERT_TRUE(src->ResizeTagList(viaCanvas.Get(), viaCanvasTags));
    EXPECT_TRUE(SameBits(*viaWindow, *viaCanvas));
    EXPECT_FALSE(src->ResizeTagList(viaWindow.Get(), {{ResizeSourceWindow, &none}})); // an empty window is refused
    // A source whose data window is part of the frame and one reaching past it,
    // read at every depth into outputs of other depths and windows.
    const ImgRectI inside(2, 1, 12, 8), beyond(-3, -2, 15, 11), part(-4, 3, 25, 14);
    const Request2D mitchell{RszMitchell, RszWindowHanning, 21.0 / 13, 14.0 / 9, 0, 0, EdgeCanvas, EdgeMirror, {}};
    for (const ImgRectI *sw : {&inside, &beyond})
        for (int sd : {DepthAInt8, DepthAFlt16, DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32})
            for (int dd : {DepthAFlt32, DepthRGBAInt16, DepthRGBAFlt32}) {
                Ref<Image> source = PatternAt(13, 9, sd, 4, sw, {0.3f, 0.3f, 0.3f, 0.5f}),
                           dst = Blank(21, 14, dd, &part);
                ASSERT_TRUE(source->ResizeTagList(dst.Get(), mitchell.Tags()));
                EXPECT_EQ(dst->GetCanvasColor(), source->GetCanvasColor());
                // A mask output holds the alpha of what an RGBA output would.
                EXPECT_TRUE(Matches(*dst, *source, mitchell, Slack(dd) + 1e-6))
                    << "window " << RectText(*sw) << " depth " << sd << " -> " << dd;
            }
    // Pre-calculation: no rows, the canvas taken over.
    Ref<Image> source = PatternAt(16, 12, DepthRGBAInt16, 3, nullptr, {0.5f, 0, 0, 0.5f}), pre = Blank(40, 30, 8);
    pre->SetNoData(true);
    EXPECT_TRUE(source->ResizeTagList(pre.Get(), {}));
    EXPECT_TRUE(!pre->HasScanLineData() && pre->GetCanvasColor() == source->GetCanvasColor());
}

TEST(ResizeTables, ReusedTablesGiveTheSameBitsThreadsAgreeAbortsRefuseAndScaleOfImageAverages) {
    Ref<Image> src = PatternAt(31, 17, DepthRGBAFlt16, 2);
    const ImgRectI part(3, 2, 40, 20), small(5, 5, 9, 9);
    const TagList request{{ResizeFilter, RszLanczos}, {ResizeXEdges, EdgeMirror}, {ResizeYEdges, EdgeCanvas}};
    Ref<Image> fresh = Blank(45, 23, DepthRGBAFlt32, &part);
    ASSERT_TRUE(src->ResizeTagList(fresh.Get(), request));
    void *tx = nullptr, *ty = nullptr, *ox = nullptr, *oy = nullptr, *sx = nullptr, *sy = nullptr;
    ASSERT_TRUE(src->ResizePreCalcTagList(fresh.Get(), tx, ty, request));
    ASSERT_TRUE(src->ResizePreCalcTagList(fresh.Get(), ox, oy, {{ResizeFilter, RszBox}}));
    ASSERT_TRUE(src->ResizePreCalcTagList(Blank(45, 23, DepthRGBAFlt32, &small).Get(), sx, sy, request));
    // The same tables give the same bits; tables of another request, a smaller window, or swapped are not used.
    const std::pair<void *, void *> tables[] = {{tx, ty}, {tx, ty}, {ox, oy}, {sx, sy}, {ty, tx}, {tx, oy}};
    for (auto [x, y] : tables) {
        Ref<Image> again = Blank(45, 23, DepthRGBAFlt32, &part);
        ASSERT_TRUE(src->ResizeTagList(again.Get(), x, y, request));
        EXPECT_TRUE(SameBits(*again, *fresh));
    }
    // Used where they fit: the small window's tables serve a small output.
    Ref<Image> smallAgain = Blank(45, 23, DepthRGBAFlt32, &small);
    ASSERT_TRUE(src->ResizeTagList(smallAgain.Get(), sx, sy, request));
    EXPECT_EQ(MaxDiff(*smallAgain, *fresh, small), 0.0);

    Image::ResizePostCalc(tx, ty);
    Image::ResizePostCalc(ox, oy);
    Image::ResizePostCalc(sx, sy);
    EXPECT_TRUE(!tx && !ty && !ox && !oy && !sx && !sy);
    // Impossible requests give no tables.
    EXPECT_FALSE(src->ResizePreCalcTagList(fresh.Get(), tx, ty, {{ResizeXScale, 0.0}}) || tx || ty);
    EXPECT_FALSE(src->ResizePreCalcTagList(fresh.Get(), tx, ty, {{ResizeYScale, NAN}}) ||
                 src->ResizePreCalcTagList(nullptr, tx, ty, {}) ||
                 src->ResizeTagList(fresh.Get(), {{ResizeXScale, -1.0}}));
    // Threads give the same bits; aborts and bad images are refused.
    Ref<Image> big = PatternAt(64, 48, DepthRGBAFlt32, 8);
    Ref<Image> threaded = Blank(150, 200, DepthRGBAFlt32), single = Blank(150, 200, DepthRGBAFlt32);
    ASSERT_TRUE(big->ResizeTagList(threaded.Get(), {{ResizeFilter, RszCatmullRom}}));
    ASSERT_TRUE(big->ResizeTagList(single.Get(), {{ResizeFilter, RszCatmullRom}, {WorkThreaded, 0}}));
    EXPECT_TRUE(SameBits(*threaded, *single));
    AbortedRequest aborted;
    Ref<Image> square = Blank(100, 100, DepthRGBAFlt32);
    EXPECT_FALSE(big->ResizeTagList(square.Get(), {{WorkRequest, &aborted.req}}));
    EXPECT_FALSE(big->ResizeTagList(nullptr, {}) || big->ResizeTagList(big.Get(), {}));
    std::atomic<bool> stop{true};
    big->SetAbortFlag(&stop);
    EXPECT_FALSE(big->ResizeTagList(square.Get(), {}));
    // ScaleOfImage averages blocks and scales windows.
    const int w = 11, h = 7, fx = 3, fy = 2;
    for (int depth : {DepthAInt8, DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
        Ref<Image> blocks = PatternAt(w, h, depth);
        blocks->SetScale(1.0, 2.0);
        Ref<Image> shrunk = blocks->ScaleOfImage(nullptr, fx, fy);
        // 11 / 3 and 7 / 2 rounded up; pixels three wide and two tall: the aspect 1:2 becomes 3:4.
        ASSERT_TRUE(shrunk && shrunk->Width() == 4 && shrunk->Height() == 4 && shrunk->Depth() == depth) << depth;
        EXPECT_DOUBLE_EQ(shrunk->XScale() / shrunk->YScale(), 3.0 / 4.0);
        // The block, cut to the frame: the last column and row of blocks are partial.
        EXPECT_TRUE(AllNear(*shrunk, shrunk->DataWindow(), Slack(depth), [&](int x, int y, int c) {
            double sum = 0;
            int n = 0;
            for (int sy = y * fy; sy < std::min(h, (y + 1) * fy); ++sy)
                for (int sx = x * fx; sx < std::min(w, (x + 1) * fx); ++sx, ++n)
                    sum += Channel(blocks->GetFlt(sx, sy), c);
            return sum / n;
        })) << depth;
    }
    // Windows round outward, canvas within the blocks, refusals.
    const ImgRectI dw(1, 1, 6, 4);
    const FltPixel canvas{0, 0, 0.5f, 0.5f};
    Ref<Image> blocks = Filled(8, 6, DepthRGBAFlt32, Constant({1, 1, 1, 1}), &dw, canvas);
    blocks->SetValidWindow(ImgRectI(2, 1, 5, 3));
    Ref<Image> shrunk = blocks->ScaleOfImage(nullptr, 2, 2);
    ASSERT_TRUE(shrunk && shrunk->DataWindow() == ImgRectI(0, 0, 3, 2)); // rounded outward
    EXPECT_TRUE(shrunk->ValidWindow() == ImgRectI(1, 0, 3, 2) && shrunk->GetCanvasColor() == canvas);
    // Block (0, 0) holds one window pixel and three canvas pixels; (1, 0) two and two; (1, 1) all inside.
    EXPECT_FLOAT_EQ(shrunk->GetFlt(0, 0).R, 0.25f);
    EXPECT_FLOAT_EQ(shrunk->GetFlt(0, 0).B, (1 + 3 * 0.5f) / 4);
    EXPECT_FLOAT_EQ(shrunk->GetFlt(1, 0).R, 0.5f);
    EXPECT_FLOAT_EQ(shrunk->GetFlt(1, 1).R, 1.f);
    EXPECT_EQ(shrunk->GetFlt(3, 0), canvas);
    Ref<Image> unscaled = blocks->ScaleOfImage(nullptr, 1, 1);
    EXPECT_TRUE(unscaled && MaxDiff(*unscaled, *blocks, ImgRectI(0, 0, 8, 6)) == 0.0);
    EXPECT_FALSE(blocks->ScaleOfImage(nullptr, 0.5, 1) || blocks->ScaleOfImage(nullptr, 2, NAN));
    RenderTask task;
    Request req(nullptr, nullptr, 0.0, 0, &task);
    EXPECT_TRUE(blocks->ScaleOfImage(&req, 2, 2));
    task.Abort();
    EXPECT_FALSE(blocks->ScaleOfImage(&req, 2, 2));
}

} // namespace
} // namespace Orvane::imgresizetest
