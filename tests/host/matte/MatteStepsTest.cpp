#include "host/matte/MatteSteps.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <functional>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/image/PixelMemory.h"
#include "tests/host/matte/MatteTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::mattestepstest {
namespace {
namespace ts = ::Orvane::Test;
namespace mt = ::Orvane::MatteTest;

// ---- models, from the formulas, in double ----

double SpillModel(double k, double a, double b, int method, double amount) {
    const double lo = std::min(a, b), hi = std::max(a, b);
    const double limits[] = {hi, (a + b) / 2, lo, std::max(0.0, (3 * lo - hi) / 2)};
    return std::max(0.0, k - amount * std::max(0.0, k - limits[method]));
}

double ContractModel(double a, double c) {
    if (c >= 1) return a > 0 ? 1 : a;
    if (c <= -1) return a < 1 ? 0 : a;
    return c >= 0 ? std::min(1.0, a / (1 - c)) : std::max(0.0, (a + c) / (1 + c));
}

double LevelsModel(double a, double low, double high, double c, double g) {
    const double a1 = high > low ? std::clamp((a - low) / (high - low), 0.0, 1.0) : a >= high ? 1.0 : 0.0;
    return std::pow(ContractModel(a1, c), 1 / g);
}

using Model = std::function<FltPixel(FltPixel p, float edge)>;

/// One channel of a pixel mapped by f.
Model OnChannel(int c, std::function<double(double)> f) {
    return [c, f](FltPixel p, float) {
        float *v[] = {&p.R, &p.G, &p.B, &p.A};
        *v[c] = static_cast<float>(f(*v[c]));
        return p;
    };
}

Model Spill(int key, int method, double amount) {
    return [=](FltPixel p, float) {
        float *k = key == 0 ? &p.B : key == 1 ? &p.G : &p.R;
        const float a = key == 2 ? p.G : p.R, b = key == 0 ? p.G : p.B;
        *k = static_cast<float>(SpillModel(*k, a, b, method, amount));
        return p;
    };
}

struct PointCase {
    std::string name;
    std::function<bool(Image *, const Image *edge)> run;
    Model model;
    int channel = 3;         ///< the channel the step works on: a one-channel image's value
    bool colourOnly = false; ///< leaves one-channel images alone
};

bool Levels(Image *img, const TagList &tags) {
    return img->IsFloat() ? DoLevelsFlt(nullptr, img, tags) : DoLevels(nullptr, img, tags);
}

std::vector<PointCase> PointCases() {
    auto spill = [](int key, int method, double amount) {
        return PointCase{"spill key " + std::to_string(key) + " method " + std::to_string(method),
                         [=](Image *img, const Image *) {
                             return MatteCore_DoSpill(nullptr, img, ChromaValues{key, amount, method});
                         },
                         Spill(key, method, amount), 3, true};
    };
    auto levels = [](std::string name, int channel, double low, double high, double c, double g) {
        const TagList tags{{MatteLevelsChannel, channel},
                           {MatteLevelsLow, low},
                           {MatteLevelsHigh, high},
                           {MatteLevelsContrast, c},
                           {MatteLevelsGamma, g}};
        return PointCase{"levels " + name, [tags](Image *img, const Image *) { return Levels(img, tags); },
                         OnChannel(channel, [=](double a) { return LevelsModel(a, low, high, c, g); }), channel};
    };
    auto infill = [](double amount) {
        return PointCase{"in-fill " + std::to_string(amount),
                         [=](Image *img, const Image *) { return MatteCore_DoInFill(nullptr, img, amount); },
                         OnChannel(3, [=](double a) { return ContractModel(a, amount); })};
    };
    const double shape = 1.3, shift[] = {0.2, -0.1, 0.05};
    return {
        spill(1, SpillRare, 1.0),
        spill(0, SpillMedium, 0.6),
        spill(2, SpillWellDone, 1.5),
        spill(1, SpillBurnt, 1.0),
        {"fringe",
         [=](Image *img, const Image *edge) {
             return img->IsFloat() ? MatteCore_DoFringeFlt(nullptr, img, edge, shape, shift[0], shift[1], shift[2])
                                   : MatteCore_DoFringe(nullptr, img, edge, shape, shift[0], shift[1], shift[2]);
         },
         [=](FltPixel p, float e) {
             const double m = std::clamp(double(e), 0.0, 1.0), w = 4 * m * (1 - m);
             float *v[] = {&p.R, &p.G, &p.B};
             for (int c = 0; c < 3; ++c) *v[c] = static_cast<float>(*v[c] * (1 + w * (shape - 1)) + w * shift[c]);
             return p;
         },
         3, true},
        {"invert alpha", [](Image *img, const Image *) { return MatteCore_DoInvert(nullptr, img); },
         OnChannel(3, [](double a) { return 1 - a; })},
        {"invert green", [](Image *img, const Image *) { return MatteCore_DoInvert(nullptr, img, MatteGreen); },
         OnChannel(1, [](double a) { return 1 - a; }), MatteGreen},
        {"post-multiply", [](Image *img, const Image *) { return MatteCore_DoPostMultiply(nullptr, img); },
         [](FltPixel p, float) {
             return FltPixel{p.R * p.A, p.G * p.A, p.B * p.A, p.A};
         },
         3, true},
        infill(0.4),
        infill(-0.3),
        infill(1.0),
        infill(-1.0),
        levels("defaults", MatteAlpha, 0, 1, 0, 1),
        levels("threshold, expand, gamma", MatteAlpha, 0.2, 0.7, 0.3, 2.2),
        levels("high below low", MatteAlpha, 0.6, 0.4, 0, 1),
        levels("red, contract, gamma", MatteRed, 0.1, 0.9, -0.5, 0.5),
        levels("solid", MatteAlpha, 0, 1, 1, 1),
        levels("clear", MatteAlpha, 0, 1, -1, 1),
    };
}

const int kDepths[] = {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32, DepthAInt8};

TEST(MatteSteps, PointStepsFollowTheirFormulasAtEveryDepthOnPixelsAndCanvas) {
    const ImgRectI window(3, 2, 13, 10);
    const FltPixel canvas{0.3f, 0.7f, 0.2f, 0.6f};
    // The edge matte reaches beyond the image's window on two sides, its canvas half-transparent.
    Ref<Image> edge = ts::WindowedImage(16, 12, {1, 4, 15, 9}, {0, 0, 0, 0.4f}, 7, DepthAFlt32);
    for (const PointCase &c : PointCases())
        for (const int depth : kDepths) {
            SCOPED_TRACE(c.name + ", " + DepthName(depth));
            Ref<Image> img = ts::WindowedImage(16, 12, window, canvas, 3, depth);
            Ref<Image> before = CopyOfImage(img.Get());
            ASSERT_TRUE(c.run(img.Get(), edge.Get()));
            const bool mask = img->IsMask();
            // A one-channel image holds the value of the channel worked on in all four places.
            auto want = [&](const FltPixel &p, float e) {
                if (mask && c.colourOnly) return p;
                const FltPixel w = c.model(mask ? FltPixel{p.A, p.A, p.A, p.A} : p, e);
                const float v[] = {w.R, w.G, w.B, w.A};
                return mask ? FltPixel{v[c.channel], v[c.channel], v[c.channel], v[c.channel]} : w;
            };
            // Beyond the image's window lies its canvas, worked with the edge's canvas.
            mt::ExpectEveryPixel(*img, [&](int x, int y) {
                return want(before->GetFlt(x, y), window.Contains(x, y) ? edge->GetFlt(x, y).A : 0.4f);
            });
            // The canvas is worked in float whatever the depth.
            ts::ExpectPixelNear(img->GetCanvasColor(), want(before->GetCanvasColor(), 0.4f), 2e-6, "canvas");
            if (::testing::Test::HasFailure()) return;
        }
}

TEST(MatteSteps, AbandonedOrRefusedStepsLeaveRowsAndCanvasAsTheyWere) {
    const std::atomic<bool> stop{true};
    Ref<Image> edge = ts::WindowedImage(16, 12, {0, 0, 16, 12}, {}, 7, DepthAFlt32);
    for (const PointCase &c : PointCases())
        for (const int depth : {DepthRGBAFlt32, DepthRGBAInt16}) {
            SCOPED_TRACE(c.name);
            Ref<Image> img = ts::WindowedImage(16, 12, {3, 2, 13, 10}, {0.3f, 0.7f, 0.2f, 0.6f}, 3, depth);
            Ref<Image> before = CopyOfImage(img.Get());
            img->SetAbortFlag(&stop);
            EXPECT_FALSE(c.run(img.Get(), edge.Get()));
            EXPECT_TRUE(mt::SamePixels(*img, *before));
            EXPECT_EQ(img->GetCanvasColor(), before->GetCanvasColor());
        }
    // An image whose rows are not made yet, under a limit that refuses them.
    Ref<Image> unmade = NewImageTagList({{ImgWidth, 64}, {ImgHeight, 64}, {ImgDepth, DepthRGBAFlt32}});
    {
        const mt::TightMemory tight;
        EXPECT_FALSE(MatteCore_DoInvert(nullptr, unmade.Get()));
        EXPECT_FALSE(TakePixelRefusal().empty());
    }
    EXPECT_EQ(unmade->GetCanvasColor(), FltPixel{});
}

TEST(MatteSteps, FormsRefuseTheOtherKindOfImageAndBadArguments) {
    Ref<Image> flt = ts::PatternImage(4, 3, DepthRGBAFlt32), word = ts::PatternImage(4, 3, DepthRGBAInt16);
    Ref<Image> fltBefore = CopyOfImage(flt.Get()), wordBefore = CopyOfImage(word.Get());
    const TagList levels{{MatteLevelsLow, 0.5}};
    const std::pair<const char *, bool> refused[] = {
        {"DoLevels on float", DoLevels(nullptr, flt.Get(), levels)},
        {"DoLevelsFlt on int16", DoLevelsFlt(nullptr, word.Get(), levels)},
        {"DoFringe on float", MatteCore_DoFringe(nullptr, flt.Get(), word.Get(), 2, 0.5, 0, 0)},
        {"DoFringeFlt on int16", MatteCore_DoFringeFlt(nullptr, word.Get(), flt.Get(), 2, 0.5, 0, 0)},
        {"fringe without an edge", MatteCore_DoFringeFlt(nullptr, flt.Get(), nullptr, 2, 0.5, 0, 0)},
        {"invert channel 4", MatteCore_DoInvert(nullptr, flt.Get(), 4)},
        {"in-fill channel -1", MatteCore_DoInFill(nullptr, flt.Get(), 0.5, -1)},
        {"levels channel 5", DoLevelsFlt(nullptr, flt.Get(), {{MatteLevelsChannel, 5}})},
        {"spill of nothing", MatteCore_DoSpill(nullptr, nullptr, {})},
        {"post-multiply of nothing", MatteCore_DoPostMultiply(nullptr, nullptr)},
    };
    for (const auto &[what, done] : refused) EXPECT_FALSE(done) << what;
    EXPECT_TRUE(mt::SamePixels(*flt, *fltBefore));
    EXPECT_TRUE(mt::SamePixels(*word, *wordBefore));
}

TEST(MatteSteps, SpillMethodsTakeMoreFromGentlestToStrongest) {
    // Green screens and spill of many kinds: R, G, B with R and B not negative.
    const FltPixel colours[] = {{0.2f, 0.9f, 0.1f, 1}, {0.5f, 0.6f, 0.4f, 1},   {0.8f, 0.8f, 0.8f, 1},
                                {0.1f, 0.3f, 0.7f, 1}, {0.f, 1.f, 0.f, 1},      {1.2f, 1.5f, 0.3f, 1},
                                {0.4f, 0.2f, 0.6f, 1}, {0.3f, 0.3f, 0.9f, 0.5f}};
    const int n = static_cast<int>(std::size(colours));
    std::vector<float> previous(n, 1e9f);
    for (int method = SpillRare; method <= SpillBurnt; ++method) {
        Ref<Image> img = NewImageTagList({{ImgWidth, n}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
        ASSERT_TRUE(img->AllocScanLineData());
        for (int x = 0; x < n; ++x) img->PutFlt(x, 0, colours[x]);
        ASSERT_TRUE(MatteCore_DoSpill(nullptr, img.Get(), {1, 1.0, method}));
        for (int x = 0; x < n; ++x) {
            const FltPixel in = colours[x], out = img->GetFlt(x, 0);
            SCOPED_TRACE("method " + std::to_string(method) + ", colour " + std::to_string(x));
            EXPECT_LE(out.G, previous[x]);
            EXPECT_LE(out.G, std::max(in.R, in.B) + 1e-6f);     // no method leaves green above both others
            if (in.G <= std::min(in.R, in.B) && in.R == in.B) { // nothing to take
                EXPECT_EQ(out.G, in.G);
            }
            EXPECT_TRUE(out.R == in.R && out.B == in.B && out.A == in.A);
            previous[x] = out.G;
        }
    }
}

TEST(MatteSteps, LevelsThresholdsContrastAndGammaAtHandPickedValues) {
    struct Case {
        double low, high, contrast, gamma, in, want;
    };
    const Case cases[] = {
        {0.2, 0.6, 0, 1, 0.4, 0.5},  {0.2, 0.6, 0, 1, 0.1, 0},    {0.2, 0.6, 0, 1, 0.9, 1},
        {0.75, 0.25, 0, 1, 0.24, 0}, {0.75, 0.25, 0, 1, 0.25, 1}, {0.75, 0.25, 0, 1, 0.5, 1},
        {0.5, 0.5, 0, 1, 0.49, 0},   {0.5, 0.5, 0, 1, 0.5, 1},    {0, 1, 0.5, 1, 0.25, 0.5},
        {0, 1, -0.5, 1, 0.75, 0.5},  {0, 1, 0, 2, 0.25, 0.5},     {0, 1, 0, 0.5, 0.5, 0.25},
        {0, 1, 1, 1, 0.001, 1},      {0, 1, -1, 1, 0.999, 0},     {0.2, 0.6, 0.5, 2, 0.3, std::sqrt(0.5)},
    };
    for (const int depth : {DepthAFlt32, DepthRGBAInt16})
        for (const Case &c : cases) {
            Ref<Image> img = NewImageTagList({{ImgWidth, 1}, {ImgHeight, 1}, {ImgDepth, depth}});
            ASSERT_TRUE(img->AllocScanLineData());
            const float in = static_cast<float>(c.in);
            img->PutFlt(0, 0, {in, in, in, in});
            ASSERT_TRUE(Levels(img.Get(), {{MatteLevelsLow, c.low},
                                           {MatteLevelsHigh, c.high},
                                           {MatteLevelsContrast, c.contrast},
                                           {MatteLevelsGamma, c.gamma}}));
            // 16 bits: the input's rounding, through slopes up to 3.5, and the result's.
            EXPECT_NEAR(img->GetFlt(0, 0).A, c.want, depth == DepthAFlt32 ? 1e-6 : 2.5 / 65535)
                << DepthName(depth) << " low " << c.low << " high " << c.high << " in " << c.in;
        }
}

} // namespace
} // namespace Orvane::mattestepstest
