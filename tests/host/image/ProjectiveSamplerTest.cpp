// Homographies from point pairs, the bilinear quad map, and resampling
// through projective matrices (the general point mapping path; the Tracker's
// corner tests run it through the bilinear map).
#include <gtest/gtest.h>

#include "host/image/PointMapping.h"
#include "host/image/QuadMap.h"
#include "host/image/TransformSampler.h"
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::Test {
namespace {

using Quad = std::array<QuadPoint, 4>;

const Quad kUnit{{{0, 0}, {1, 0}, {1, 1}, {0, 1}}};

/// How far the homography misses its pairs, by the divide by w written out here.
double Residual(const Matrix3 &h, const Quad &from, const Quad &to) {
    double worst = 0.0;
    for (int i = 0; i < 4; ++i) {
        const double w = h(2, 0) * from[i].x + h(2, 1) * from[i].y + h(2, 2);
        const double x = (h(0, 0) * from[i].x + h(0, 1) * from[i].y + h(0, 2)) / w;
        const double y = (h(1, 0) * from[i].x + h(1, 1) * from[i].y + h(1, 2)) / w;
        worst = std::max({worst, std::fabs(x - to[i].x), std::fabs(y - to[i].y)});
    }
    return worst;
}

TEST(QuadMap, HomographyFromPointPairs) {
    struct Case {
        const char *name;
        Quad from, to;
        bool ok;
    } cases[] = {
        {"identity", kUnit, kUnit, true},
        {"scale and move", kUnit, Quad{{{10, 20}, {30, 20}, {30, 60}, {10, 60}}}, true},
        {"keystone", kUnit, Quad{{{0, 0}, {100, 0}, {70, 50}, {30, 50}}}, true},
        {"general", Quad{{{3, 1}, {90, 12}, {80, 70}, {-5, 60}}}, Quad{{{12, 7}, {200, -4}, {150, 130}, {40, 90}}},
         true},
        {"turned order", kUnit, Quad{{{1, 0}, {1, 1}, {0, 1}, {0, 0}}}, true},
        {"three on a line (from)", Quad{{{0, 0}, {1, 0}, {2, 0}, {0, 1}}}, kUnit, false},
        {"three on a line (to)", kUnit, Quad{{{0, 0}, {5, 5}, {10, 10}, {0, 3}}}, false},
        {"repeated point", kUnit, Quad{{{0, 0}, {0, 0}, {1, 1}, {0, 1}}}, false},
        {"all one point", kUnit, Quad{{{4, 4}, {4, 4}, {4, 4}, {4, 4}}}, false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Matrix3 h;
        ASSERT_EQ(HomographyFromPoints(c.from.data(), c.to.data(), h), c.ok);
        if (!c.ok) continue;
        EXPECT_LT(Residual(h, c.from, c.to), 1e-9);
        // The reverse pairs give the inverse (up to scale): composed, the identity.
        Matrix3 back;
        ASSERT_TRUE(HomographyFromPoints(c.to.data(), c.from.data(), back));
        Matrix3 round = back * h;
        for (double &v : round.m) v /= round(2, 2);
        EXPECT_TRUE(round.IsIdentity(1e-9));
    }
}

TEST(QuadMap, BilinearRoundTripsAndRefusals) {
    struct Case {
        const char *name;
        Quad q;
        bool ok;
    } cases[] = {
        {"square", Quad{{{0, 0}, {10, 0}, {10, 10}, {0, 10}}}, true},
        {"trapezoid", Quad{{{0, 0}, {100, 0}, {70, 50}, {30, 50}}}, true},
        {"general", Quad{{{12, 7}, {200, -4}, {150, 130}, {40, 90}}}, true},
        {"clockwise", Quad{{{0, 0}, {0, 10}, {12, 14}, {9, -1}}}, true},
        {"not convex", Quad{{{0, 0}, {10, 0}, {2, 2}, {0, 10}}}, false},
        {"crossed", Quad{{{0, 0}, {10, 10}, {10, 0}, {0, 10}}}, false},
        {"three on a line", Quad{{{0, 0}, {5, 0}, {10, 0}, {0, 10}}}, false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        BilinearQuad b;
        ASSERT_EQ(b.Set(c.q.data()), c.ok);
        if (!c.ok) continue;
        for (int i = 0; i < 4; ++i) {
            double x, y;
            b.Forward(kUnit[i].x, kUnit[i].y, x, y);
            EXPECT_NEAR(x, c.q[i].x, 1e-12);
            EXPECT_NEAR(y, c.q[i].y, 1e-12);
        }
        // Forward then back over a grid that also reaches outside the square.
        for (double s = -0.25; s <= 1.25; s += 0.125)
            for (double t = -0.25; t <= 1.25; t += 0.125) {
                double x, y, s2, t2;
                b.Forward(s, t, x, y);
                ASSERT_TRUE(b.Inverse(x, y, s2, t2));
                EXPECT_NEAR(s2, s, 1e-9) << s << "," << t;
                EXPECT_NEAR(t2, t, 1e-9) << s << "," << t;
            }
    }
}

/// A 4-channel float image whose pixel (x, y) holds (x, y, x + 1000 y, 1): where a sample came from.
Ref<Image> Coordinates(int w, int h) {
    return Filled(w, h, DepthRGBAFlt32, [](int x, int y) {
        return FltPixel{float(x), float(y), float(x + 1000 * y), 1};
    });
}

TEST(ProjectiveSampler, PixelsLandWhereTheHomographySays) {
    // A 40 x 30 source pinned into a keystone of a 64 x 48 output.
    const int sw = 40, sh = 30;
    Ref<Image> src = Coordinates(sw, sh);
    const Quad frame{{{0, 0}, {double(sw), 0}, {double(sw), double(sh)}, {0, double(sh)}}};
    const Quad quad{{{4, 3}, {60, 6}, {50, 44}, {10, 40}}};
    Matrix3 toOut, toSrc;
    ASSERT_TRUE(HomographyFromPoints(frame.data(), quad.data(), toOut));
    ASSERT_TRUE(HomographyFromPoints(quad.data(), frame.data(), toSrc));
    Ref<Image> nearest = Blank(64, 48, DepthRGBAFlt32);
    ASSERT_TRUE(TransformImage(*src, *nearest, toSrc, {RszNearest, RszWindowHanning, EdgeCanvas}));
    int inside = 0;
    for (int y = 0; y < 48; ++y)
        for (int x = 0; x < 64; ++x) {
            // Where the centre comes from, by the homography's equations.
            const double w = toSrc(2, 0) * (x + 0.5) + toSrc(2, 1) * (y + 0.5) + toSrc(2, 2);
            const double u = (toSrc(0, 0) * (x + 0.5) + toSrc(0, 1) * (y + 0.5) + toSrc(0, 2)) / w;
            const double v = (toSrc(1, 0) * (x + 0.5) + toSrc(1, 1) * (y + 0.5) + toSrc(1, 2)) / w;
            const FltPixel p = nearest->GetFlt(x, y);
            const bool in = u >= 1e-6 && u < sw - 1e-6 && v >= 1e-6 && v < sh - 1e-6;
            const bool edge = std::fabs(u - std::round(u)) < 1e-6 || std::fabs(v - std::round(v)) < 1e-6;
            if (edge) continue;
            if (!in) {
                EXPECT_EQ(p.A, 0.f) << x << "," << y;
                continue;
            }
            ++inside;
            ASSERT_EQ(p.R, std::floor(u)) << x << "," << y;
            ASSERT_EQ(p.G, std::floor(v)) << x << "," << y;
        }
    EXPECT_GT(inside, 1000);
    // Linear filtering of a linear ramp gives the position itself where the map enlarges.
    Ref<Image> linear = Blank(64, 48, DepthRGBAFlt32);
    ASSERT_TRUE(TransformImage(*src, *linear, toSrc, {RszLinear, RszWindowHanning, EdgeCanvas}));
    double worst = 0.0;
    for (double fx : {0.3, 0.5, 0.7})
        for (double fy : {0.3, 0.5, 0.7}) {
            double X, Y;
            toOut.Apply(fx * sw, fy * sh, X, Y);
            const int x = int(X), y = int(Y);
            double u, v;
            toSrc.Apply(x + 0.5, y + 0.5, u, v);
            const FltPixel p = linear->GetFlt(x, y);
            worst = std::max({worst, std::fabs(p.R - (u - 0.5)), std::fabs(p.G - (v - 0.5))});
        }
    EXPECT_LT(worst, 1e-4);
    // The output window holds every pixel that got colour, and the source window every pixel read.
    const ImgRectI win = TransformedWindow(src->DataWindow(), toOut, {RszLinear, RszWindowHanning, EdgeCanvas});
    for (int y = 0; y < 48; ++y)
        for (int x = 0; x < 64; ++x)
            if (linear->GetFlt(x, y).A != 0.f) {
                EXPECT_TRUE(win.Contains(x, y)) << x << "," << y;
            }
    const ImgRectI reads =
        TransformSourceWindow(ImgRectI(0, 0, 64, 48), toOut, {RszLinear, RszWindowHanning, EdgeCanvas});
    EXPECT_TRUE(reads.x0 <= 0 && reads.y0 <= 0 && reads.x1 >= sw && reads.y1 >= sh) << RectText(reads);
}

TEST(ProjectiveSampler, AffineMatricesWrittenProjectivelyMatchTheAffinePath) {
    Ref<Image> src = PatternAt(37, 29, DepthRGBAFlt32, 5);
    struct Case {
        const char *name;
        Matrix3 m;
        int filter;
        double scale; ///< the matrix is multiplied by it, making the last row (0, 0, scale)
    } cases[] = {
        {"identity, linear", Matrix3::Identity(), RszLinear, 2.0},
        {"rotate and enlarge, cubic", Matrix3::Rotate(23) * Matrix3::Scale(0.7, 0.8) * Matrix3::Translate(-3, 2),
         RszCubic, 3.0},
        {"shrink, linear", Matrix3::Scale(2.5, 1.7) * Matrix3::Rotate(-40), RszLinear, -1.0},
        {"rotate, sinc", Matrix3::Translate(18, 14) * Matrix3::Rotate(10) * Matrix3::Translate(-18, -14), RszSinc, 0.5},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Matrix3 scaled = c.m;
        for (double &v : scaled.m) v *= c.scale;
        ASSERT_FALSE(scaled.IsAffine());
        const ImgRectI dw(-3, -2, 41, 33);
        Ref<Image> a = Blank(37, 29, DepthRGBAFlt32, &dw), b = Blank(37, 29, DepthRGBAFlt32, &dw);
        const TransformSampling s{c.filter, RszWindowHanning, EdgeCanvas};
        ASSERT_TRUE(TransformImage(*src, *a, c.m, s));
        ASSERT_TRUE(TransformImage(*src, *b, scaled, s));
        EXPECT_LT(MaxDiff(*a, *b, dw), 2e-6);
    }
}

TEST(ProjectiveSampler, HorizonAndSingularMappings) {
    Ref<Image> src = Filled(20, 20, DepthRGBAFlt32, Constant({1, 1, 1, 1}));
    // w = 1 - x / 10 on the output: the horizon is the column x = 10, past it nothing of the source shows.
    Matrix3 m;
    m(2, 0) = -0.1;
    Ref<Image> out = Blank(20, 20, DepthRGBAFlt32);
    ASSERT_TRUE(TransformImage(*src, *out, m, {RszLinear, RszWindowHanning, EdgeCanvas}));
    for (int y = 3; y < 12; y += 3) { // rows whose taps stay inside the frame
        EXPECT_EQ(out->GetFlt(15, y).A, 0.f);
        EXPECT_EQ(out->GetFlt(1, y).A, 1.f);
    }
    // A source window that reaches the horizon makes an endless output; the singular map none.
    Matrix3 toOut;
    ASSERT_TRUE(m.Invert(toOut));
    const ImgRectI big = TransformedWindow(ImgRectI(0, 0, 400, 20), toOut, {});
    EXPECT_TRUE(IsEndlessSide(big.x0) || IsEndlessSide(big.x1)) << RectText(big);
    Matrix3 flat;
    flat.m = {1, 2, 0, 2, 4, 0, 0.1, 0.2, 1}; // rank 2
    EXPECT_FALSE(TransformImage(*src, *out, flat, {}));
    EXPECT_TRUE(TransformedWindow(ImgRectI(0, 0, 20, 20), flat, {}).IsNull());
}

} // namespace
} // namespace Orvane::Test
