// The band rasteriser: the value across a band between two circles and a cone, inverted; exact coverage of a tiled
// ring; where a pixel's samples sit; the same bits for any band split; direct and band-image writing; every depth
// under the blend rule; folds; centre samples away from the curves; refused memory and abort.
#include "host/shape/StripRasterizer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <cstring>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/image/PixelMemory.h"

namespace Orvane::striprastertest {
namespace {

const double kPi = std::acos(-1.0);

/// Regular polygons of `count` corners around (cx, cy) with circumradii rIn and rOut, as a closed strip; rIn 0 gives
/// a single inner point. The inner curve takes the even slots when `innerOnEven`.
std::vector<StripPoint> Ring(double cx, double cy, double rIn, double rOut, int count, bool innerOnEven = true,
                             double phase = 0.1) {
    std::vector<StripPoint> strip;
    for (int i = 0; i <= count; ++i) {
        const double a = phase + 2 * kPi * (i % count) / count;
        const StripPoint in{cx + rIn * std::cos(a), cy + rIn * std::sin(a)};
        const StripPoint out{cx + rOut * std::cos(a), cy + rOut * std::sin(a)};
        strip.push_back(innerOnEven ? in : out);
        strip.push_back(innerOnEven ? out : in);
    }
    return strip;
}

Ref<Image> Mask(int depth, const ImgRectI &window, float fill, int size = 100) {
    Ref<Image> img =
        NewImageTagList({{ImgWidth, size}, {ImgHeight, size}, {ImgDepth, depth}, {ImgDataWindow, &window}});
    EXPECT_TRUE(img && img->AllocScanLineData());
    img->Fill({fill, fill, fill, fill});
    return img;
}

StripRasterResult Draw(const std::vector<StripPoint> &strip, Image &mask, StripRasterOptions options) {
    return RasterizeStrip(strip.data(), strip.size(), &mask, options);
}

bool SameRows(const Image &a, const Image &b) {
    for (int y = a.DataWindow().y0; y < a.DataWindow().y1; ++y)
        if (std::memcmp(a.ScanLine(y), b.ScanLine(y), a.RowBytes()) != 0) return false;
    return true;
}

TEST(StripRasterizer, ValueFallsLinearlyFromTheInnerToTheOuterCurve) {
    struct Case {
        double rIn, rOut;
        bool invert, innerOnEven;
        int n, depth;
        double tol;
    } cases[] = {
        {20, 45, false, true, 32, DepthAFlt32, 0.004}, {20, 45, true, true, 32, DepthAFlt32, 0.004},
        {20, 45, false, false, 8, DepthAInt16, 0.004}, {12, 30, false, true, 1, DepthAFlt32, 0.004},
        {0, 40, false, true, 8, DepthAInt8, 0.006}, // a cone from a single inner point
        {0, 40, true, true, 32, DepthAFlt16, 0.004},
    };
    const double cx = 50.3, cy = 49.7;
    for (const Case &c : cases) {
        Ref<Image> mask = Mask(c.depth, ImgRectI(0, 0, 100, 100), 0.f);
        StripRasterOptions opt;
        opt.innerOnEven = c.innerOnEven, opt.invert = c.invert, opt.subSamples = c.n;
        ASSERT_TRUE(Draw(Ring(cx, cy, c.rIn, c.rOut, 720, c.innerOnEven), *mask, opt).Ok());
        for (int y = 0; y < 100; ++y)
            for (int x = 0; x < 100; ++x) {
                const double r = std::hypot(x + 0.5 - cx, y + 0.5 - cy);
                const float got = mask->GetFlt(x, y).A;
                if (r > std::max(c.rIn, 0.75) + 1.5 && r < c.rOut - 1.5) {
                    const double t = (c.rOut - r) / (c.rOut - c.rIn);
                    EXPECT_NEAR(got, c.invert ? 1 - t : t, c.tol)
                        << "r " << r << " n " << c.n << " x " << x << " y " << y;
                } else if (r > c.rOut + 1 || r < c.rIn - 1) {
                    EXPECT_EQ(got, 0.f) << "outside the band at r " << r;
                }
            }
    }
}

TEST(StripRasterizer, ATiledRingIsCoveredExactlyOnceWithNoSeams) {
    struct Case {
        double cx, cy, rIn, rOut, phase;
        int corners, n;
        double areaTol;
    } cases[] = {
        {64.37, 63.81, 20, 50, 0.1, 500, 32, 0.5},
        {64.37, 63.81, 20, 50, 0.1, 500, 8, 2},
        {64.37, 63.81, 20, 50, 0.1, 500, 1, 40},
        {60.2, 61.9, 9.5, 55, 1.0, 37, 3, 5},
        {64.5, 64.5, 20 * std::sqrt(2.0), 50 * std::sqrt(2.0), kPi / 4, 4, 1, 0}, // square edges through centres
        {64.5, 64.5, 20 * std::sqrt(2.0), 50 * std::sqrt(2.0), kPi / 4, 4, 32, 0},
    };
    const ImgRectI rect(0, 0, 128, 128);
    for (const Case &c : cases) {
        const std::vector<StripPoint> strip = Ring(c.cx, c.cy, c.rIn, c.rOut, c.corners, true, c.phase);
        std::vector<float> value(128 * 128), coverage(128 * 128);
        StripRasterOptions opt;
        opt.subSamples = c.n;
        AccumulateStrip(strip.data(), strip.size(), rect, opt, value.data(), coverage.data());
        const double exact = (c.n & (c.n - 1)) == 0 ? 0 : 1e-5; // sample weights 1/n^2 sum exactly for powers of 2
        const double apothem = std::cos(kPi / c.corners);
        double sum = 0;
        for (int y = 0; y < 128; ++y)
            for (int x = 0; x < 128; ++x) {
                const float cov = coverage[y * 128 + x];
                sum += cov;
                const double r = std::hypot(x + 0.5 - c.cx, y + 0.5 - c.cy);
                EXPECT_LE(cov, 1 + exact) << "counted twice at " << x << "," << y << " n " << c.n;
                if (r - 0.7072 > c.rIn && r + 0.7072 < c.rOut * apothem) {
                    EXPECT_NEAR(cov, 1, exact) << "seam at " << x << "," << y << " n " << c.n;
                }
                if (r - 0.7072 > c.rOut || r + 0.7072 < c.rIn * apothem) {
                    EXPECT_EQ(cov, 0.f) << "outside at " << x << "," << y;
                }
            }
        const double area = 0.5 * c.corners * std::sin(2 * kPi / c.corners) * (c.rOut * c.rOut - c.rIn * c.rIn);
        EXPECT_NEAR(sum, area, c.areaTol + 1e-3) << "corners " << c.corners << " n " << c.n;
    }
}

TEST(StripRasterizer, SamplesSitInsideTheirPixelSoARectangleCoversItsPixelArea) {
    // A band of two triangles over [x0, x1] x [y0, y1]: 1 along y0, 0 along y1.
    struct Case {
        double x0, y0, x1, y1;
        int n;
    } cases[] = {{2, 3, 6, 7, 1}, {2, 3, 6, 7, 32}, {2.5, 3.25, 6.5, 7.75, 8}, {2.5, 3.25, 6.5, 7.75, 32}};
    for (const Case &c : cases) {
        const std::vector<StripPoint> strip = {{c.x0, c.y0}, {c.x0, c.y1}, {c.x1, c.y0}, {c.x1, c.y1}};
        Ref<Image> over0 = Mask(DepthAFlt32, ImgRectI(0, 0, 10, 10), 0.f),
                   over1 = Mask(DepthAFlt32, ImgRectI(0, 0, 10, 10), 1.f);
        StripRasterOptions opt;
        opt.subSamples = c.n;
        Draw(strip, *over0, opt);
        Draw(strip, *over1, opt);
        for (int y = 0; y < 10; ++y)
            for (int x = 0; x < 10; ++x) {
                const double ox = std::max(0.0, std::min(x + 1.0, c.x1) - std::max<double>(x, c.x0));
                const double lo = std::max<double>(y, c.y0), hi = std::min(y + 1.0, c.y1);
                const double cover = ox * std::max(0.0, hi - lo);
                const double value = cover > 0 ? cover * (c.y1 - (lo + hi) / 2) / (c.y1 - c.y0) : 0;
                EXPECT_NEAR(over0->GetFlt(x, y).A, value, 1e-5) << x << "," << y << " n " << c.n;
                EXPECT_NEAR(over1->GetFlt(x, y).A, 1 - cover + value, 1e-5) << x << "," << y << " n " << c.n;
            }
    }
}

TEST(StripRasterizer, AnySplitIntoBandsAndWorkersGivesTheSameBits) {
    struct Count {
        int height, workers, bands;
    } counts[] = {{100, 16, 8}, {100, 3, 3}, {20, 8, 2}, {5, 8, 1}, {64, 8, 8}, {63, 8, 7}, {0, 4, 1}};
    for (const Count &c : counts)
        EXPECT_EQ(StripBandCount(c.height, c.workers), c.bands) << c.height << " " << c.workers;

    const ImgRectI window(-7, 5, 93, 107); // not at the origin, partly outside the frame
    const std::vector<StripPoint> strip = Ring(40.3, 55.1, 15, 48, 300);
    Ref<Image> reference = Mask(DepthAFlt32, window, 0.2f);
    StripRasterOptions opt;
    opt.workers = 1;
    ASSERT_EQ(Draw(strip, *reference, opt).bands, 1);
    const int before = WorkerCount();
    for (int poolSize : {1, 4})
        for (int workers : {2, 3, 8}) {
            SetWorkerCount(poolSize);
            Ref<Image> mask = Mask(DepthAFlt32, window, 0.2f);
            opt.workers = workers;
            EXPECT_EQ(Draw(strip, *mask, opt).bands, workers);
            EXPECT_TRUE(SameRows(*mask, *reference)) << workers << " bands on " << poolSize << " workers";
        }
    SetWorkerCount(before);
}

TEST(StripRasterizer, EveryDepthBlendsTheBandOverThePreviousMaskDirectlyOrThroughABandImage) {
    const ImgRectI window(3, 2, 97, 95);
    const std::vector<StripPoint> strip = Ring(50.5, 48.2, 18, 40, 400);
    std::vector<float> value(window.Width() * window.Height()), coverage(value.size());
    StripRasterOptions opt;
    opt.subSamples = 8;
    AccumulateStrip(strip.data(), strip.size(), window, opt, value.data(), coverage.data());
    const double quantum[] = {0, 1 / 255.0, 1 / 65535.0, 1 / 2048.0, 1e-6};
    for (int depth = DepthAInt8; depth <= DepthAFlt32; ++depth)
        for (bool direct : {true, false}) {
            Ref<Image> mask = Mask(depth, window, 0.f);
            for (int y = window.y0; y < window.y1; ++y)
                for (int x = window.x0; x < window.x1; ++x)
                    mask->PutFlt(x, y, {0, 0, 0, float((x * 7 + y * 3) % 11) / 10});
            opt.direct = direct;
            ASSERT_TRUE(Draw(strip, *mask, opt).Ok());
            // The band image rounds the value to 16 bits before the mask rounds to its own depth.
            const double tol = quantum[depth] + (direct ? 0 : 1 / 65535.0) + 1e-6;
            for (int y = window.y0; y < window.y1; ++y)
                for (int x = window.x0; x < window.x1; ++x) {
                    const size_t i = static_cast<size_t>(y - window.y0) * window.Width() + (x - window.x0);
                    const double before = float((x * 7 + y * 3) % 11) / 10;
                    const double want = before * (1 - coverage[i]) + value[i];
                    ASSERT_NEAR(mask->GetFlt(x, y).A, want, tol)
                        << DepthName(depth) << " direct " << direct << " at " << x << "," << y;
                }
        }
}

TEST(StripRasterizer, OverlappingFoldsClampCoverageAndAverageTheirValues) {
    // The strip drawn twice over itself: coverage 2c clamps to 1 and the value 2v is divided by 2c.
    const ImgRectI window(0, 0, 100, 100);
    std::vector<StripPoint> twice = Ring(50.2, 50.7, 15, 40, 200);
    const size_t once = twice.size();
    twice.insert(twice.end(), twice.begin(), twice.begin() + once);
    std::vector<float> value(100 * 100), coverage(value.size());
    StripRasterOptions opt;
    AccumulateStrip(twice.data(), once, window, opt, value.data(), coverage.data());
    Ref<Image> mask = Mask(DepthAFlt32, window, 0.5f);
    Draw(twice, *mask, opt);
    for (int y = 0; y < 100; ++y)
        for (int x = 0; x < 100; ++x) {
            const double c = 2.0 * coverage[y * 100 + x], v = 2.0 * value[y * 100 + x];
            const double want = 0.5 * (1 - std::min(c, 1.0)) + v / std::max(c, 1.0);
            ASSERT_NEAR(mask->GetFlt(x, y).A, want, 2e-6) << x << "," << y;
        }
}

TEST(StripRasterizer, CentreSamplesAwayFromTheCurvesAgreeWithEverySample) {
    // Every pixel a curve, an end or a fold touches takes all n x n samples; the others their centre, which for a
    // pixel inside one triangle is the mean of its samples. So coverage agrees exactly, and the value within the
    // kinks of the piecewise linear band.
    struct Case {
        const char *name;
        std::vector<StripPoint> strip;
        double valueTol;
    };
    std::vector<StripPoint> skewed = Ring(60.3, 61.7, 18, 50, 90), crossing, open,
                            twice = Ring(60.2, 60.7, 15, 40, 200);
    for (size_t i = 1; i < skewed.size(); i += 2) { // the outer samples half a step round from the inner ones
        const double a = 0.1 + 2 * kPi * (double((i / 2) % 90) + 0.5) / 90;
        skewed[i] = {60.3 + 50 * std::cos(a), 61.7 + 50 * std::sin(a)};
    }
    for (int i = 0; i <= 60; ++i) { // two lines that swap sides half way: the strip folds over
        const double x = 10.3 + 1.7 * i, wave = 12 * std::sin(i / 9.0);
        crossing.push_back({x, 60.4 + wave});
        crossing.push_back({x + 0.6, 60.4 - wave});
        open.push_back({x, 30.2 + 0.3 * i});
        open.push_back({x + 3.1, 75.9 + 0.1 * i});
    }
    twice.insert(twice.end(), twice.begin(), twice.end());
    const Case cases[] = {
        {"ring", Ring(60.3, 61.7, 18, 50, 300), 2e-4},
        {"skewed pairs", skewed, 1e-3},
        {"cone", Ring(60.3, 61.7, 0, 45, 120), 1e-3},
        {"crossing", crossing, 1 / 64.0},
        {"open", open, 1e-3},
        {"twice over", twice, 5e-4},
    };
    const ImgRectI rect(-3, 2, 125, 124);
    const size_t pixels = size_t(rect.Width()) * rect.Height();
    for (const Case &c : cases)
        for (int n : {8, 32}) {
            std::vector<float> value(pixels), coverage(pixels), allValue(pixels), allCoverage(pixels);
            StripRasterOptions opt;
            opt.subSamples = n;
            AccumulateStrip(c.strip.data(), c.strip.size(), rect, opt, value.data(), coverage.data());
            opt.edgesOnly = false;
            AccumulateStrip(c.strip.data(), c.strip.size(), rect, opt, allValue.data(), allCoverage.data());
            double worstCoverage = 0, worstValue = 0, covered = 0;
            for (size_t i = 0; i < pixels; ++i) {
                worstCoverage = std::max(worstCoverage, double(std::fabs(coverage[i] - allCoverage[i])));
                worstValue = std::max(worstValue, double(std::fabs(value[i] - allValue[i])));
                covered += allCoverage[i];
            }
            EXPECT_GT(covered, 500) << c.name;
            EXPECT_LE(worstCoverage, 2e-6) << c.name << " n " << n;
            EXPECT_LE(worstValue, c.valueTol) << c.name << " n " << n;
        }
}

TEST(StripRasterizer, RefusedMemoryOrAnAbortLeavesTheRowsUnchangedAndSaysSo) {
    const std::vector<StripPoint> strip = Ring(50, 50, 10, 45, 100);
    for (bool direct : {true, false})
        for (int failure = 0; failure < 2; ++failure) {
            Ref<Image> mask = Mask(DepthAInt16, ImgRectI(0, 0, 100, 100), 0.25f), untouched = CopyOfImage(mask.Get());
            std::atomic<bool> abortFlag{true};
            StripRasterOptions opt;
            opt.direct = direct, opt.workers = 4;
            if (failure == 0)
                mask->SetAbortFlag(&abortFlag);
            else
                SetPixelMemoryLimit(PixelMemoryInUse() + 1024);
            const StripRasterResult result = Draw(strip, *mask, opt);
            SetPixelMemoryLimit(0);
            EXPECT_FALSE(result.Ok());
            EXPECT_EQ(result.aborted, failure == 0);
            EXPECT_EQ(result.droppedBands, failure == 0 ? 0 : 4) << "direct " << direct;
            EXPECT_TRUE(SameRows(*mask, *untouched)) << "failure " << failure << " direct " << direct;
        }
}

} // namespace
} // namespace Orvane::striprastertest
