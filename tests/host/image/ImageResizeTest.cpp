// Resizing through the separable filters, and shrinking by whole factors.
// Expected pixels come from a direct convolution written here from the
// filters' formulas (in double, with its own edge handling), never from the
// weight tables; hand-computed borders pin the edge policies down; constants,
// identities, reused tables, windows, depths and aborts are checked as
// invariants.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstring>
#include <functional>
#include <numbers>
#include <optional>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/Resample.h"
#include "host/image/ResizeFilters.h"
#include "tests/support/TestSupport.h"

namespace Orvane::imgresizetest {
namespace {
namespace ts = ::Orvane::Test;

constexpr int kAllFilters[] = {RszNearest,  RszBox,      RszLinear,  RszQuadratic, RszCubic, RszCatmullRom,
                               RszGaussian, RszMitchell, RszLanczos, RszSinc,      RszBessel};
constexpr int kWindows[] = {RszWindowHanning, RszWindowHamming, RszWindowBlackman, RszWindowKaiser};
constexpr int kEdges[] = {EdgeCanvas, EdgeWrap, EdgeDuplicate, EdgeMirror};

// ---- the filters, written out from their definitions ----

double Sinc(double x) { return x == 0 ? 1.0 : std::sin(std::numbers::pi * x) / (std::numbers::pi * x); }

double Window(int window, double t) {
    const double c = std::cos(std::numbers::pi * t);
    switch (window) {
    case RszWindowHamming: return 0.54 + 0.46 * c;
    case RszWindowBlackman: return 0.42 + 0.5 * c + 0.08 * std::cos(2 * std::numbers::pi * t);
    case RszWindowKaiser: return std::cyl_bessel_i(0.0, 6.5 * std::sqrt(1 - t * t)) / std::cyl_bessel_i(0.0, 6.5);
    default: return 0.5 + 0.5 * c;
    }
}

/// The filter at distance x (source pixels at scale 1); 0 beyond its radius.
double Filter(int filter, int window, double x) {
    const double a = std::fabs(x);
    switch (filter) {
    case RszLinear: return a < 1 ? 1 - a : 0;
    case RszQuadratic: return a < 0.5 ? 0.75 - a * a : a < 1.5 ? 0.5 * (a - 1.5) * (a - 1.5) : 0;
    case RszCubic: return a < 1 ? (4 - 6 * a * a + 3 * a * a * a) / 6 : a < 2 ? (2 - a) * (2 - a) * (2 - a) / 6 : 0;
    case RszCatmullRom:
        return a < 1 ? 1.5 * a * a * a - 2.5 * a * a + 1 : a < 2 ? -0.5 * a * a * a + 2.5 * a * a - 4 * a + 2 : 0;
    case RszGaussian: return a < 1.5 ? std::exp(-2 * a * a) : 0;
    case RszMitchell:
        return a < 1   ? (7 * a * a * a - 12 * a * a + 16.0 / 3) / 6
               : a < 2 ? (-7.0 / 3 * a * a * a + 12 * a * a - 20 * a + 32.0 / 3) / 6
                       : 0;
    case RszLanczos: return a < 3 ? Sinc(a) * Sinc(a / 3) : 0;
    case RszSinc: return a < 4 ? Sinc(a) * Window(window, a / 4) : 0;
    case RszBessel: {
        if (a >= 4) return 0;
        const double jinc = a == 0 ? 1.0 : 2 * std::cyl_bessel_j(1.0, std::numbers::pi * a) / (std::numbers::pi * a);
        return jinc * Window(window, a / 4);
    }
    default: return a <= 0.5 ? 1 : 0; // nearest, box
    }
}

double Radius(int filter) {
    switch (filter) {
    case RszLinear: return 1;
    case RszQuadratic:
    case RszGaussian: return 1.5;
    case RszCubic:
    case RszCatmullRom:
    case RszMitchell: return 2;
    case RszLanczos: return 3;
    case RszSinc:
    case RszBessel: return 4;
    default: return 0.5;
    }
}

/// Normalised weights of source samples (before any edge policy) for output
/// sample o: the direct definition of each filter.
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
    const double reach = Radius(filter) * stretch;
    double sum = 0;
    for (int j = static_cast<int>(std::floor(u - reach)) - 1; j <= u + reach; ++j) {
        const double v = Filter(filter, window, (j + 0.5 - u) / stretch);
        if (v != 0) w.push_back({j, v}), sum += v;
    }
    for (auto &p : w) p.second /= sum;
    return w;
}

/// Where an index beyond [lo, hi) reads under an edge policy; none for the canvas.
std::optional<int> EdgeIndex(int j, int lo, int hi, int edges) {
    if (j >= lo && j < hi) return j;
    const int n = hi - lo;
    switch (edges) {
    case EdgeWrap: return lo + ((j - lo) % n + n) % n;
    case EdgeDuplicate: return j < lo ? lo : hi - 1;
    case EdgeMirror: {
        const int k = ((j - lo) % (2 * n) + 2 * n) % (2 * n);
        return lo + (k < n ? k : 2 * n - 1 - k);
    }
    default: return std::nullopt;
    }
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

/// The expected output pixel (x, y): the separable convolution in double.
FltPixel Expected(const Image &src, const Request2D &r, int x, int y) {
    const ImgRectI range = r.range.IsNull() ? (src.Frame() | src.DataWindow()) : r.range;
    const FltPixel canvas = src.GetCanvasColor();
    double acc[4] = {0, 0, 0, 0};
    for (auto [j, wy] : RefWeights(r.filter, r.window, r.sy, r.oy, y))
        for (auto [i, wx] : RefWeights(r.filter, r.window, r.sx, r.ox, x)) {
            const auto mi = EdgeIndex(i, range.x0, range.x1, r.ex), mj = EdgeIndex(j, range.y0, range.y1, r.ey);
            const FltPixel p = mi && mj ? src.GetFlt(*mi, *mj) : canvas;
            const double w = wx * wy;
            acc[0] += w * p.R, acc[1] += w * p.G, acc[2] += w * p.B, acc[3] += w * p.A;
        }
    return {float(acc[0]), float(acc[1]), float(acc[2]), float(acc[3])};
}

Ref<Image> Blank(int w, int h, int depth, const ImgRectI *dw = nullptr) {
    TagList tags{{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}};
    if (dw) tags.Set({ImgDataWindow, dw});
    return NewImageTagList(tags);
}

/// The pattern image at `depth` (values stored there, so that reads are exact).
Ref<Image> Pattern(int w, int h, int depth, unsigned seed = 3, const ImgRectI *dw = nullptr) {
    Ref<Image> f = ts::PatternImage(w, h, DepthRGBAFlt32, seed);
    Ref<Image> img = Blank(w, h, depth, dw);
    img->AllocScanLineData();
    img->ImageCopy(f.Get());
    return img;
}

/// What one stored component may differ by from an exact value.
double Slack(int depth) {
    switch ((depth - 1) % 4) {
    case 0: return 0.5 / 255 + 1e-5;
    case 1: return 0.5 / 65535 + 1e-5;
    case 2: return 1.5e-3; // half float near 1.5
    default: return 2e-5;
    }
}

void ExpectImageNear(const Image &got, const Image &src, const Request2D &r, double tol, const char *what) {
    const ImgRectI dw = got.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const FltPixel e = Expected(src, r, x, y), g = got.GetFlt(x, y);
            float want[4] = {e.R, e.G, e.B, e.A};
            const float have[4] = {g.R, g.G, g.B, g.A};
            if (!got.IsFloat()) // integers hold 0..1
                for (float &v : want) v = std::clamp(v, 0.f, 1.f);
            for (int c = got.IsMask() ? 3 : 0; c < 4; ++c)
                ASSERT_NEAR(have[c], want[c], tol) << what << " at " << x << "," << y << " channel " << c;
        }
}

bool SameBits(const Image &a, const Image &b) {
    if (a.DataWindow() != b.DataWindow() || a.Depth() != b.Depth()) return false;
    for (int y = a.DataWindow().y0; y < a.DataWindow().y1; ++y)
        if (std::memcmp(a.ScanLine(y), b.ScanLine(y), a.RowBytes()) != 0) return false;
    return true;
}

// ---- the filters ----

TEST(ResizeFilters, ValuesFollowTheirDefinitionsAndVanishAtTheirRadius) {
    for (int filter : kAllFilters)
        for (int window : kWindows) {
            SCOPED_TRACE(testing::Message() << "filter " << filter << " window " << window);
            EXPECT_EQ(ResizeFilterSupport(filter), Radius(filter));
            EXPECT_EQ(Image::GetResizeFilterSupport(filter), Radius(filter));
            for (double x = -4.5; x <= 4.5; x += 0.0625) {
                if (filter <= RszBox && std::fabs(std::fabs(x) - 0.5) < 1e-12) continue; // the box's edge
                EXPECT_NEAR(ResizeFilterValue(filter, window, x), Filter(filter, window, x), 1e-12) << x;
            }
            EXPECT_EQ(ResizeFilterValue(filter, window, Radius(filter) + 1e-9), 0.0);
            if (filter == RszLinear || filter == RszCatmullRom || filter == RszLanczos || filter == RszSinc) {
                // Interpolating: 1 on the sample, 0 on every other.
                EXPECT_NEAR(ResizeFilterValue(filter, window, 0.0), 1.0, 1e-15);
                for (int k = 1; k <= 4; ++k) EXPECT_NEAR(ResizeFilterValue(filter, window, k), 0.0, 1e-15) << k;
            }
        }
    // Unknown numbers fall back to linear and Hanning.
    EXPECT_EQ(ValidResizeFilter(0), RszLinear);
    EXPECT_EQ(ValidResizeFilter(12), RszLinear);
    EXPECT_EQ(ValidResizeWindow(99), RszWindowHanning);
    EXPECT_EQ(ResizeFilterValue(RszSinc, 104, 1.3), ResizeFilterValue(RszSinc, RszWindowHanning, 1.3));
}

TEST(ResampleAxis, WeightsSumToOneRunsAreEvenAndAreaFiltersSpreadEvenly) {
    for (int filter : kAllFilters)
        for (double scale : {0.25, 1.0 / 3, 0.5, 1.0, 1.7, 4.0})
            for (int edges : {int(EdgeCanvas), int(EdgeDuplicate), EdgeRenormalise}) {
                SCOPED_TRACE(testing::Message() << "filter " << filter << " scale " << scale << " edges " << edges);
                const int src = 48, out = static_cast<int>(src * scale);
                ResampleAxis axis;
                ASSERT_TRUE(axis.Build({filter, RszWindowHanning, scale, 0.0, edges, 0, src}, 0, out));
                ASSERT_EQ(axis.Count(), out);
                ASSERT_EQ(axis.Taps() % 2, 0);
                std::vector<double> received(src, 0.0);
                for (int i = 0; i < out; ++i) {
                    double sum = 0.0;
                    if (edges == EdgeRenormalise) {
                        ASSERT_GE(axis.First(i), 0);
                        for (int k = 0; k < axis.Taps(); ++k)
                            if (axis.Weights(i)[k] != 0) {
                                ASSERT_LT(axis.First(i) + k, src);
                            }
                    }
                    ASSERT_NE(axis.Weights(i)[0], 0.f) << "runs start on a weight";
                    if (i > 0) {
                        ASSERT_GE(axis.First(i), axis.First(i - 1));
                    }
                    for (int k = 0; k < axis.Taps(); ++k) {
                        sum += axis.Weights(i)[k];
                        const int j = axis.First(i) + k;
                        if (j >= 0 && j < src) received[j] += axis.Weights(i)[k];
                    }
                    EXPECT_NEAR(sum, 1.0, 1e-6) << i;
                }
                // Whole shrink factors: with the box and the tent every source pixel
                // away from the ends counts the same, 1 / factor, so averages are kept.
                const double factor = 1.0 / scale;
                if ((filter == RszBox || filter == RszLinear) && scale < 1 &&
                    std::fabs(factor - std::round(factor)) < 1e-9) {
                    for (int j = 8; j < src - 8; ++j) EXPECT_NEAR(received[j], scale, 1e-6) << j;
                }
            }
    ResampleAxis bad;
    EXPECT_FALSE(bad.Build({RszLinear, RszWindowHanning, 0.0, 0.0, EdgeDuplicate, 0, 4}, 0, 4));
    EXPECT_FALSE(bad.Build({RszLinear, RszWindowHanning, NAN, 0.0, EdgeDuplicate, 0, 4}, 0, 4));
    EXPECT_FALSE(bad.Build({RszLinear, RszWindowHanning, 1.0, INFINITY, EdgeDuplicate, 0, 4}, 0, 4));
    EXPECT_FALSE(bad.Build({RszLinear, RszWindowHanning, 1.0, 0.0, EdgeDuplicate, 4, 4}, 0, 4));
    EXPECT_FALSE(bad.Build({RszLinear, RszWindowHanning, 1.0, 3e9, EdgeDuplicate, 0, 4}, 0, 4));
    EXPECT_FALSE(bad.IsValid());
}

// ---- pixels against the direct convolution ----

TEST(ResizeTagList, EveryFilterMatchesTheDirectConvolution) {
    struct Geometry {
        double sx, sy, ox, oy;
        int dw, dh;
    };
    // Up, down, a whole shrink, unequal axes, and pure shifts.
    const Geometry geometries[] = {{2.5, 0.4, 0, 0, 33, 4},
                                   {0.5, 0.5, 0, 0, 7, 5},
                                   {0.37, 1.6, 0.3, -0.6, 5, 15},
                                   {1, 1, 0.3, -1.7, 13, 9},
                                   {1.25, 0.8, -2, 1.5, 17, 8}};
    Ref<Image> src = Pattern(13, 9, DepthRGBAFlt32, 11);
    src->SetCanvasColor(FltPixel{0.2f, -0.1f, 0.4f, 0.6f});
    for (int filter : kAllFilters)
        for (int window : (filter == RszSinc || filter == RszBessel)
                              ? std::vector<int>(std::begin(kWindows), std::end(kWindows))
                              : std::vector<int>{RszWindowHanning})
            for (const Geometry &g : geometries) {
                Request2D r;
                r.filter = filter, r.window = window;
                r.sx = g.sx, r.sy = g.sy, r.ox = g.ox, r.oy = g.oy;
                r.ex = kEdges[(filter + window) % 4], r.ey = kEdges[(filter + window + 1) % 4];
                SCOPED_TRACE(testing::Message() << "filter " << filter << " window " << window << " scale " << g.sx
                                                << "x" << g.sy << " edges " << r.ex << "," << r.ey);
                Ref<Image> dst = Blank(g.dw, g.dh, DepthRGBAFlt32);
                ASSERT_TRUE(src->ResizeTagList(dst.Get(), r.Tags()));
                ExpectImageNear(*dst, *src, r, 2e-5, "pattern");
            }
}

TEST(ResizeTagList, ImpulsesRampsAndCheckerboards) {
    // An impulse spreads into the filter's own shape: along a row, output
    // pixel x at scale 1 and offset 0.25 holds f(x + 0.5 - 0.25 - 0.5 - 6) normalised.
    Ref<Image> impulse = Blank(13, 1, DepthAFlt32);
    impulse->AllocScanLineData();
    impulse->Fill({0, 0, 0, 0});
    impulse->PutFlt(6, 0, {1, 1, 1, 1});
    for (int filter : {RszLinear, RszCatmullRom, RszLanczos, RszMitchell, RszGaussian}) {
        SCOPED_TRACE(filter);
        Ref<Image> dst = Blank(13, 1, DepthAFlt32);
        ASSERT_TRUE(impulse->ResizeTagList(dst.Get(), {{ResizeFilter, filter}, {ResizeXOffset, 0.25}}));
        for (int x = 0; x < 13; ++x) {
            double sum = 0;
            for (int j = -8; j < 8; ++j) sum += Filter(filter, 0, j + 0.25);
            EXPECT_NEAR(dst->GetFlt(x, 0).A, Filter(filter, 0, 6 - (x - 0.25)) / sum, 1e-6) << x;
        }
    }
    // Straight ramps stay straight under filters that reproduce lines (away
    // from the ends): pixel i holds the ramp at its centre.
    constexpr int rw = 64, rh = 48;
    Ref<Image> ramp = Blank(rw, rh, DepthRGBAFlt32);
    ramp->AllocScanLineData();
    auto value = [](double x, double y) { return 0.1 + 0.02 * x + 0.03 * y; };
    for (int y = 0; y < rh; ++y)
        for (int x = 0; x < rw; ++x) {
            const float v = float(value(x + 0.5, y + 0.5));
            ramp->PutFlt(x, y, {v, 1 - v, 0.5f * v, 1});
        }
    for (int filter : {RszLinear, RszCatmullRom, RszLanczos, RszCubic, RszMitchell, RszQuadratic})
        for (double s : {2.3, 0.5, 0.25}) {
            SCOPED_TRACE(testing::Message() << "filter " << filter << " scale " << s);
            const int w = int(rw * s), h = int(rh * s);
            Ref<Image> dst = Blank(w, h, DepthRGBAFlt32);
            ASSERT_TRUE(ramp->ResizeTagList(dst.Get(), {{ResizeFilter, filter}, {ResizeXScale, s}, {ResizeYScale, s}}));
            const double reach = Radius(filter) * std::max(1.0, 1 / s) + 1;
            int checked = 0;
            for (int y = 0; y < h; ++y)
                for (int x = 0; x < w; ++x) {
                    const double u = (x + 0.5) / s, v = (y + 0.5) / s;
                    if (u < reach || u > rw - reach || v < reach || v > rh - reach) continue;
                    // Lanczos reproduces lines only up to its ripple.
                    EXPECT_NEAR(dst->GetFlt(x, y).R, value(u, v), filter == RszLanczos ? 2e-3 : 2e-5) << x << "," << y;
                    ++checked;
                }
            EXPECT_GT(checked, 0);
        }
    // A one-pixel checkerboard halved by the box and the tent is flat grey:
    // each output pixel averages as many black as white pixels.
    Ref<Image> checker = Blank(16, 12, DepthRGBAInt16);
    checker->AllocScanLineData();
    for (int y = 0; y < 12; ++y)
        for (int x = 0; x < 16; ++x) {
            const float v = (x + y) % 2 ? 1.f : 0.f;
            checker->PutFlt(x, y, {v, v, v, 1});
        }
    for (int filter : {RszBox, RszLinear}) {
        Ref<Image> dst = Blank(8, 6, DepthRGBAFlt32);
        ASSERT_TRUE(checker->ResizeTagList(dst.Get(), {{ResizeFilter, filter}}));
        for (int y = 1; y < 5; ++y)
            for (int x = 1; x < 7; ++x) EXPECT_NEAR(dst->GetFlt(x, y).R, 0.5, 1e-6) << filter << " " << x << "," << y;
    }
}

TEST(ResizeTagList, IdentityIsExactForInterpolatingFiltersAtEveryDepth) {
    for (int depth = 1; depth <= 8; ++depth)
        for (int filter : {RszNearest, RszBox, RszLinear, RszCatmullRom, RszLanczos, RszSinc})
            for (int edges : kEdges) {
                SCOPED_TRACE(testing::Message() << "depth " << depth << " filter " << filter << " edges " << edges);
                Ref<Image> src = Pattern(13, 9, depth, 7);
                Ref<Image> dst = Blank(13, 9, depth);
                ASSERT_TRUE(src->ResizeTagList(dst.Get(), {{ResizeFilter, filter},
                                                           {ResizeWindow, RszWindowBlackman},
                                                           {ResizeXEdges, edges},
                                                           {ResizeYEdges, edges}}));
                ASSERT_TRUE(SameBits(*dst, *src));
            }
}

TEST(ResizeTagList, AConstantStaysConstantUnderEveryFilterAndEdge) {
    const FltPixel c{0.25f, 0.5f, 0.75f, 0.625f};
    for (int depth : {DepthAInt8, DepthAFlt32, DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32})
        for (int filter : kAllFilters)
            for (int edges : kEdges) {
                SCOPED_TRACE(testing::Message() << "depth " << depth << " filter " << filter << " edges " << edges);
                // The data window is a part of the frame; the canvas is the same colour.
                const ImgRectI part(2, 1, 11, 8);
                Ref<Image> flat = Blank(13, 9, depth, &part);
                flat->AllocScanLineData();
                flat->Fill(c);
                flat->SetCanvasColor(flat->GetFlt(part.x0, part.y0));
                const FltPixel stored = flat->GetFlt(part.x0, part.y0);
                for (auto [w, h] : {std::pair{29, 20}, std::pair{5, 4}, std::pair{13, 30}}) {
                    Ref<Image> dst = Blank(w, h, depth);
                    ASSERT_TRUE(flat->ResizeTagList(
                        dst.Get(),
                        {{ResizeFilter, filter}, {ResizeXEdges, edges}, {ResizeYEdges, edges}, {ResizeXOffset, 0.4}}));
                    for (int y = 0; y < h; ++y)
                        for (int x = 0; x < w; ++x) {
                            const FltPixel p = dst->GetFlt(x, y);
                            ASSERT_NEAR(p.R, stored.R, 2e-6) << x << "," << y;
                            ASSERT_NEAR(p.A, stored.A, 2e-6) << x << "," << y;
                        }
                }
            }
}

// ---- edges, offsets, source windows ----

TEST(ResizeTagList, EdgePoliciesAtTheBorderByHand) {
    // A row a b c d (0.1, 0.2, 0.4, 0.8) shifted right by 1.5 pixels: output
    // pixel 0 sits at u = -1, between source pixels -2 and -1 (half each),
    // and output pixel 5 at u = 4, between 3 and 4.
    Ref<Image> row = Blank(4, 1, DepthAFlt32);
    row->AllocScanLineData();
    const float v[4] = {0.1f, 0.2f, 0.4f, 0.8f};
    for (int x = 0; x < 4; ++x) row->PutFlt(x, 0, {v[x], v[x], v[x], v[x]});
    row->SetCanvasColor(FltPixel{0, 0, 0, 0.05f});
    struct Case {
        int edges;
        double at0, at5; // expected: pixels (-2, -1) and (3, 4)
    };
    const Case cases[] = {
        {EdgeCanvas, 0.05, (0.8 + 0.05) / 2},         // beyond the row: the canvas
        {EdgeWrap, (0.4 + 0.8) / 2, (0.8 + 0.1) / 2}, // -2 reads c, -1 reads d; 4 reads a
        {EdgeDuplicate, 0.1, 0.8},                    // the end pixels repeat
        {EdgeMirror, (0.2 + 0.1) / 2, 0.8},           // -1 reads a, -2 reads b; 4 reads d
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.edges);
        Ref<Image> dst = Blank(6, 1, DepthAFlt32);
        ASSERT_TRUE(row->ResizeTagList(dst.Get(), {{ResizeFilter, RszLinear},
                                                   {ResizeXScale, 1.0},
                                                   {ResizeXOffset, 1.5},
                                                   {ResizeXEdges, c.edges},
                                                   {ResizeYEdges, EdgeDuplicate}}));
        EXPECT_NEAR(dst->GetFlt(0, 0).A, c.at0, 1e-7);
        EXPECT_NEAR(dst->GetFlt(5, 0).A, c.at5, 1e-7);
        // Inside, the shift reads its two neighbours: pixel 2 at u = 1 is (a + b) / 2.
        EXPECT_NEAR(dst->GetFlt(2, 0).A, (0.1 + 0.2) / 2, 1e-7);
    }
    // Vertically the same rules: a one-pixel-wide column, Mirror below, Wrap above.
    Ref<Image> col = Blank(1, 4, DepthRGBAFlt32);
    col->AllocScanLineData();
    for (int y = 0; y < 4; ++y) col->PutFlt(0, y, {v[y], v[y], v[y], 1});
    Ref<Image> dst = Blank(1, 7, DepthRGBAFlt32);
    const ImgRectI all(-10, -10, 10, 17);
    Ref<Image> wide = Blank(1, 7, DepthRGBAFlt32, &all);
    for (Image *d : {dst.Get(), wide.Get()})
        ASSERT_TRUE(col->ResizeTagList(
            d, {{ResizeFilter, RszNearest}, {ResizeYScale, 1.0}, {ResizeYOffset, 2.0}, {ResizeYEdges, EdgeMirror}}));
    const float want[7] = {0.2f, 0.1f, 0.1f, 0.2f, 0.4f, 0.8f, 0.8f}; // rows -2, -1 mirrored; 4 mirrored
    for (int y = 0; y < 7; ++y) EXPECT_FLOAT_EQ(dst->GetFlt(0, y).R, want[y]) << y;
    // Beyond the frame the table keeps reading by the same rules.
    EXPECT_FLOAT_EQ(wide->GetFlt(0, -1).R, 0.4f);   // row -3: mirrored to 2
    EXPECT_FLOAT_EQ(wide->GetFlt(5, 3).R, want[3]); // columns repeat (Duplicate by default)
}

TEST(ResizeTagList, OffsetsMoveTheOutputInOutputPixels) {
    Ref<Image> src = Pattern(10, 8, DepthRGBAFlt32, 5);
    // Whole offsets at scale 1 move the pixels exactly.
    Ref<Image> moved = Blank(10, 8, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(moved.Get(), {{ResizeFilter, RszLanczos},
                                                 {ResizeXOffset, 3.0},
                                                 {ResizeYOffset, -2.0},
                                                 {ResizeXEdges, EdgeCanvas},
                                                 {ResizeYEdges, EdgeCanvas}}));
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 10; ++x) ASSERT_EQ(moved->GetFlt(x, y), src->GetFlt(x - 3, y + 2)) << x << "," << y;
    // At scale 2 the offset counts in output pixels: offset 2 moves by one source pixel.
    Ref<Image> big = Blank(20, 16, DepthRGBAFlt32), bigShift = Blank(20, 16, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(big.Get(), {{ResizeFilter, RszCatmullRom}}));
    ASSERT_TRUE(src->ResizeTagList(bigShift.Get(), {{ResizeFilter, RszCatmullRom}, {ResizeXOffset, 2.0}}));
    for (int y = 0; y < 16; ++y)
        for (int x = 2; x < 20; ++x) ASSERT_EQ(bigShift->GetFlt(x, y), big->GetFlt(x - 2, y));
}

TEST(ResizeTagList, TheSourceWindowLimitsWhatIsRead) {
    Ref<Image> src = Pattern(16, 12, DepthRGBAFlt32, 9);
    const ImgRectI window(3, 2, 11, 9);
    // Cut out and resized alone: the same pixels, as the window's edge repeats either way.
    Ref<Image> cut = Blank(8, 7, DepthRGBAFlt32);
    ASSERT_TRUE(src->ImageCrop(cut.Get(), 3, 2, {}));
    for (int filter : {RszLinear, RszLanczos, RszBox}) {
        SCOPED_TRACE(filter);
        Request2D r;
        r.filter = filter, r.sx = 1.5, r.sy = 0.75, r.range = window;
        Ref<Image> dst = Blank(24, 9, DepthRGBAFlt32);
        ASSERT_TRUE(src->ResizeTagList(dst.Get(), r.Tags()));
        ExpectImageNear(*dst, *src, r, 2e-5, "window");
        // The window moved to the origin is the cut image; the output moves by 1.5 x 3 and 0.75 x 2.
        Ref<Image> alone = Blank(24, 9, DepthRGBAFlt32);
        ASSERT_TRUE(cut->ResizeTagList(alone.Get(), {{ResizeFilter, filter},
                                                     {ResizeXScale, 1.5},
                                                     {ResizeYScale, 0.75},
                                                     {ResizeXOffset, 4.5},
                                                     {ResizeYOffset, 1.5}}));
        for (int y = 0; y < 9; ++y)
            for (int x = 0; x < 24; ++x) {
                const FltPixel a = dst->GetFlt(x, y), b = alone->GetFlt(x, y);
                ASSERT_NEAR(a.R, b.R, 1e-5) << x << "," << y;
                ASSERT_NEAR(a.A, b.A, 1e-5) << x << "," << y;
            }
    }
    // An endless window: no edge policy ever applies, and everything beyond
    // the data window is canvas, as with the Canvas policy at the frame.
    src->SetCanvasColor(FltPixel{0.5f, 0.25f, 0, 1});
    const ImgRectI endless(-DomainEndless, -DomainEndless, DomainEndless, DomainEndless);
    Ref<Image> viaWindow = Blank(21, 9, DepthRGBAFlt32), viaCanvas = Blank(21, 9, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(
        viaWindow.Get(),
        {{ResizeFilter, RszCatmullRom}, {ResizeSourceWindow, &endless}, {ResizeXOffset, -3.0}, {ResizeYOffset, 2.5}}));
    ASSERT_TRUE(src->ResizeTagList(viaCanvas.Get(), {{ResizeFilter, RszCatmullRom},
                                                     {ResizeXEdges, EdgeCanvas},
                                                     {ResizeYEdges, EdgeCanvas},
                                                     {ResizeXOffset, -3.0},
                                                     {ResizeYOffset, 2.5}}));
    EXPECT_TRUE(SameBits(*viaWindow, *viaCanvas));
    // An empty window is refused.
    const ImgRectI none;
    Ref<Image> dst = Blank(8, 8, DepthRGBAFlt32);
    EXPECT_FALSE(src->ResizeTagList(dst.Get(), {{ResizeSourceWindow, &none}}));
}

TEST(ResizeTagList, DataWindowsCanvasAndDepths) {
    // A source whose data window is part of the frame and one reaching past it,
    // read at every depth into outputs of other depths and windows.
    const ImgRectI inside(2, 1, 12, 8), beyond(-3, -2, 15, 11);
    for (const ImgRectI *sw : {&inside, &beyond})
        for (int sd : {DepthAInt8, DepthAFlt16, DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32})
            for (int dd : {DepthAFlt32, DepthRGBAInt16, DepthRGBAFlt32}) {
                SCOPED_TRACE(testing::Message() << "window " << sw->x0 << " depth " << sd << " -> " << dd);
                Ref<Image> src = Pattern(13, 9, sd, 4, sw);
                src->SetCanvasColor(FltPixel{0.3f, 0.3f, 0.3f, 0.5f});
                const ImgRectI part(-4, 3, 25, 14);
                Ref<Image> dst = Blank(21, 14, dd, &part);
                Request2D r;
                r.filter = RszMitchell, r.sx = 21.0 / 13, r.sy = 14.0 / 9, r.ex = EdgeCanvas, r.ey = EdgeMirror;
                ASSERT_TRUE(src->ResizeTagList(dst.Get(), r.Tags()));
                EXPECT_EQ(dst->GetCanvasColor(), src->GetCanvasColor());
                // A mask output holds the alpha of what an RGBA output would.
                ExpectImageNear(*dst, *src, r, Slack(dd) + 1e-6, "depth");
            }
    // Pre-calculation: no rows, the canvas taken over.
    Ref<Image> src = Pattern(16, 12, DepthRGBAInt16);
    src->SetCanvasColor(FltPixel{0.5f, 0, 0, 0.5f});
    Ref<Image> pre = Blank(40, 30, DepthRGBAFlt32);
    pre->SetNoData(true);
    EXPECT_TRUE(src->ResizeTagList(pre.Get(), {}));
    EXPECT_FALSE(pre->HasScanLineData());
    EXPECT_EQ(pre->GetCanvasColor(), src->GetCanvasColor());
}

// ---- tables ----

TEST(ResizeTables, ReusedTablesGiveTheSameBitsAndMismatchedOnesAreNotUsed) {
    Ref<Image> src = Pattern(31, 17, DepthRGBAFlt16, 2);
    const ImgRectI part(3, 2, 40, 20);
    const TagList request{{ResizeFilter, RszLanczos}, {ResizeXEdges, EdgeMirror}, {ResizeYEdges, EdgeCanvas}};
    Ref<Image> fresh = Blank(45, 23, DepthRGBAFlt32, &part);
    ASSERT_TRUE(src->ResizeTagList(fresh.Get(), request));

    void *tx = nullptr, *ty = nullptr;
    ASSERT_TRUE(src->ResizePreCalcTagList(fresh.Get(), tx, ty, request));
    ASSERT_TRUE(tx && ty);
    for (int frame = 0; frame < 2; ++frame) { // the same tables, frame after frame
        Ref<Image> again = Blank(45, 23, DepthRGBAFlt32, &part);
        ASSERT_TRUE(src->ResizeTagList(again.Get(), tx, ty, request));
        EXPECT_TRUE(SameBits(*again, *fresh));
    }
    // Tables of another request, of a smaller window, or swapped, must not be
    // used: the result is what the request itself gives.
    void *ox = nullptr, *oy = nullptr, *sx = nullptr, *sy = nullptr;
    ASSERT_TRUE(src->ResizePreCalcTagList(fresh.Get(), ox, oy, {{ResizeFilter, RszBox}}));
    const ImgRectI small(5, 5, 9, 9);
    Ref<Image> smallImg = Blank(45, 23, DepthRGBAFlt32, &small);
    ASSERT_TRUE(src->ResizePreCalcTagList(smallImg.Get(), sx, sy, request));
    const std::pair<void *, void *> wrong[] = {{ox, oy}, {sx, sy}, {ty, tx}, {tx, oy}};
    for (auto [x, y] : wrong) {
        Ref<Image> other = Blank(45, 23, DepthRGBAFlt32, &part);
        ASSERT_TRUE(src->ResizeTagList(other.Get(), x, y, request));
        EXPECT_TRUE(SameBits(*other, *fresh));
    }
    // Used where they fit: the small window's tables serve a small output.
    Ref<Image> smallAgain = Blank(45, 23, DepthRGBAFlt32, &small);
    ASSERT_TRUE(src->ResizeTagList(smallAgain.Get(), sx, sy, request));
    for (int y = small.y0; y < small.y1; ++y)
        for (int x = small.x0; x < small.x1; ++x) ASSERT_EQ(smallAgain->GetFlt(x, y), fresh->GetFlt(x, y));

    Image::ResizePostCalc(tx, ty);
    Image::ResizePostCalc(ox, oy);
    Image::ResizePostCalc(sx, sy);
    EXPECT_TRUE(!tx && !ty && !ox && !oy && !sx && !sy);
    // Impossible requests give no tables.
    EXPECT_FALSE(src->ResizePreCalcTagList(fresh.Get(), tx, ty, {{ResizeXScale, 0.0}}));
    EXPECT_TRUE(tx == nullptr && ty == nullptr);
    EXPECT_FALSE(src->ResizePreCalcTagList(fresh.Get(), tx, ty, {{ResizeYScale, NAN}}));
    EXPECT_FALSE(src->ResizePreCalcTagList(nullptr, tx, ty, {}));
    EXPECT_FALSE(src->ResizeTagList(fresh.Get(), {{ResizeXScale, -1.0}}));
}

TEST(ResizeTagList, ThreadsAndAbort) {
    Ref<Image> src = Pattern(64, 48, DepthRGBAFlt32, 8);
    const TagList request{{ResizeFilter, RszCatmullRom}};
    Ref<Image> threaded = Blank(150, 200, DepthRGBAFlt32), single = Blank(150, 200, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(threaded.Get(), request));
    TagList one = request;
    one.Set({WorkThreaded, 0});
    ASSERT_TRUE(src->ResizeTagList(single.Get(), one));
    EXPECT_TRUE(SameBits(*threaded, *single));

    RenderTask task;
    task.Abort();
    Request req(nullptr, nullptr, 0.0, 0, &task);
    Ref<Image> dst = Blank(100, 100, DepthRGBAFlt32);
    EXPECT_FALSE(src->ResizeTagList(dst.Get(), {{WorkRequest, &req}}));
    std::atomic<bool> stop{true};
    src->SetAbortFlag(&stop);
    EXPECT_FALSE(src->ResizeTagList(dst.Get(), {}));
    EXPECT_FALSE(src->ResizeTagList(nullptr, {}));
    EXPECT_FALSE(src->ResizeTagList(src.Get(), {}));
}

// ---- ScaleOfImage ----

TEST(ScaleOfImage, AveragesBlocksAndScalesWindows) {
    for (int depth : {DepthAInt8, DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
        SCOPED_TRACE(depth);
        const int w = 11, h = 7, fx = 3, fy = 2;
        Ref<Image> src = Pattern(w, h, depth);
        src->SetScale(1.0, 2.0);
        Ref<Image> out = src->ScaleOfImage(nullptr, fx, fy);
        ASSERT_TRUE(out);
        EXPECT_EQ(out->Width(), 4); // 11 / 3 rounded up
        EXPECT_EQ(out->Height(), 4);
        EXPECT_EQ(out->Depth(), depth);
        // Pixels three wide and two tall: the aspect 1:2 becomes 3:4.
        EXPECT_DOUBLE_EQ(out->XScale() / out->YScale(), 3.0 / 4.0);
        for (int y = 0; y < out->Height(); ++y)
            for (int x = 0; x < out->Width(); ++x) {
                // The block, cut to the frame: the last column and row of blocks are partial.
                double sum[4] = {0, 0, 0, 0};
                int n = 0;
                for (int sy = y * fy; sy < std::min(h, (y + 1) * fy); ++sy)
                    for (int sx = x * fx; sx < std::min(w, (x + 1) * fx); ++sx, ++n) {
                        const FltPixel p = src->GetFlt(sx, sy);
                        sum[0] += p.R, sum[1] += p.G, sum[2] += p.B, sum[3] += p.A;
                    }
                const FltPixel got = out->GetFlt(x, y);
                EXPECT_NEAR(got.R, sum[depth <= DepthAFlt32 ? 3 : 0] / n, Slack(depth));
                EXPECT_NEAR(got.A, sum[3] / n, Slack(depth));
            }
    }
}

TEST(ScaleOfImage, WindowsCanvasAndRefusals) {
    const ImgRectI dw(1, 1, 6, 4);
    Ref<Image> src = Blank(8, 6, DepthRGBAFlt32, &dw);
    src->AllocScanLineData();
    src->Fill({1, 1, 1, 1});
    const FltPixel canvas{0, 0, 0.5f, 0.5f};
    src->SetCanvasColor(canvas);
    src->SetValidWindow(ImgRectI(2, 1, 5, 3));
    Ref<Image> out = src->ScaleOfImage(nullptr, 2, 2);
    ASSERT_TRUE(out);
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 3, 2)); // rounded outward
    EXPECT_EQ(out->ValidWindow(), ImgRectI(1, 0, 3, 2));
    EXPECT_EQ(out->GetCanvasColor(), canvas);
    // Block (0, 0) holds one window pixel and three canvas pixels; block (1, 0) two and two.
    EXPECT_FLOAT_EQ(out->GetFlt(0, 0).R, 0.25f);
    EXPECT_FLOAT_EQ(out->GetFlt(0, 0).B, (1 + 3 * 0.5f) / 4);
    EXPECT_FLOAT_EQ(out->GetFlt(1, 0).R, 0.5f);
    EXPECT_FLOAT_EQ(out->GetFlt(1, 1).R, 1.f); // rows 2 and 3, columns 2 and 3: all inside
    EXPECT_EQ(out->GetFlt(3, 0), canvas);

    Ref<Image> same = src->ScaleOfImage(nullptr, 1, 1);
    ASSERT_TRUE(same);
    for (int y = 0; y < 6; ++y)
        for (int x = 0; x < 8; ++x) EXPECT_EQ(same->GetFlt(x, y), src->GetFlt(x, y));

    EXPECT_FALSE(src->ScaleOfImage(nullptr, 0.5, 1));
    EXPECT_FALSE(src->ScaleOfImage(nullptr, 2, NAN));
    RenderTask task;
    Request req(nullptr, nullptr, 0.0, 0, &task);
    EXPECT_TRUE(src->ScaleOfImage(&req, 2, 2));
    task.Abort();
    EXPECT_FALSE(src->ScaleOfImage(&req, 2, 2));
}

} // namespace
} // namespace Orvane::imgresizetest
