// The keying plates' own promises: determinism, the areas their shapes cover, the composite formula, the screen's
// bounds, keyable foreground colours, and the two scores on mattes whose errors are worked out here.
#include "tests/support/KeyPlates.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <functional>
#include <numbers>
#include <set>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::keyplatestest {
namespace {
using namespace ::Orvane::Test;

constexpr int kW = 192, kH = 108; // the shorter side is the unit of the layout's sizes
constexpr double kPi = std::numbers::pi;

using PixelFn = std::function<FltPixel(int x, int y)>;

Ref<Image> MakeImage(int depth, const PixelFn &value, int w = kW, int h = kH) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    img->AllocScanLineData();
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) img->PutFlt(x, y, value(x, y));
    return img;
}

/// Calls fn(x, y) for every pixel of the test frame.
void EachPixel(const std::function<void(int, int)> &fn) {
    for (int y = 0; y < kH; ++y)
        for (int x = 0; x < kW; ++x) fn(x, y);
}

bool SameBits(const Image &a, const Image &b) {
    for (int y = 0; y < a.Height(); ++y)
        if (std::memcmp(a.ScanLine(y), b.ScanLine(y), a.RowBytes())) return false;
    return true;
}

TEST(KeyPlates, SameSeedSameBitsAndOnlyHairAndGrainFollowTheSeed) {
    const KeyPlate a = MakeKeyPlate(KeyPlateKind::Everything, ScreenColor::Green, kW, kH, 7);
    const KeyPlate b = MakeKeyPlate(KeyPlateKind::Everything, ScreenColor::Green, kW, kH, 7);
    const KeyPlate other = MakeKeyPlate(KeyPlateKind::Everything, ScreenColor::Green, kW, kH, 8);
    EXPECT_EQ(a.name, "everything-green");
    EXPECT_TRUE(SameBits(*a.composite, *b.composite));
    EXPECT_TRUE(SameBits(*a.trueAlpha, *b.trueAlpha));
    EXPECT_FALSE(SameBits(*a.composite, *other.composite));
    EXPECT_FALSE(SameBits(*a.trueAlpha, *other.trueAlpha)); // other strands
    const KeyPlate hard = MakeKeyPlate(KeyPlateKind::HardEdges, ScreenColor::Green, kW, kH, 7);
    const KeyPlate hardBlue = MakeKeyPlate(KeyPlateKind::HardEdges, ScreenColor::Blue, kW, kH, 8);
    EXPECT_TRUE(SameBits(*hard.trueAlpha, *hardBlue.trueAlpha));
}

// Each kind's alpha: in [0, 1], its plateaus present, its covered area against the shapes' areas worked out from
// their sizes (a Gaussian-blurred disc of radius R covers pi (R^2 + sigma^2); a smear keeps the area), and the
// kinds adding up to Everything (their shapes do not overlap).
TEST(KeyPlates, AlphaOfEachKind) {
    struct Case {
        KeyPlateKind kind;
        std::vector<double> plateaus;
        double area, tolerance; // in squared shorter sides (0: not checked), relative
        bool onSampleGrid;      // every alpha a multiple of 1/16 (sharp edges seen through 4 x 4 samples)
    };
    const double box = 4 * 0.10 * 0.16 - (4 - kPi) * 0.02 * 0.02, veil = 4 * 0.09 * 0.06 - (4 - kPi) * 0.01 * 0.01;
    const Case cases[] = {
        {KeyPlateKind::HardEdges, {1.0}, box + kPi * 0.12 * 0.12, 0.002, true},
        {KeyPlateKind::SoftEdges, {1.0}, kPi * (0.14 * 0.14 + 0.012 * 0.012), 0.0005, false},
        {KeyPlateKind::Hair, {1.0}, 0, 0, false},
        {KeyPlateKind::MotionBlur, {1.0}, 4 * 0.08 * 0.10, 0.002, false},
        {KeyPlateKind::Veils, {0.4, 0.7}, 1.1 * veil, 0.004, false},
    };
    const KeyPlate all = MakeKeyPlate(KeyPlateKind::Everything, ScreenColor::Blue, kW, kH, 3);
    std::vector<FltPixel> sum(kW * kH);
    for (const Case &c : cases) {
        SCOPED_TRACE(KeyPlateKindName(c.kind));
        const KeyPlate plate = MakeKeyPlate(c.kind, ScreenColor::Blue, kW, kH, 3);
        double area = 0, lowest = 1, highest = 0;
        int partial = 0, offGrid = 0;
        std::set<double> levels;
        std::vector<int> onPlateau(c.plateaus.size());
        EachPixel([&](int x, int y) {
            const double a = plate.trueAlpha->GetFlt(x, y).A;
            lowest = std::min(lowest, a), highest = std::max(highest, a), area += a;
            partial += a > 0 && a < 1;
            offGrid += a * 16 != std::round(a * 16);
            levels.insert(a);
            for (size_t i = 0; i < c.plateaus.size(); ++i) onPlateau[i] += std::abs(a - c.plateaus[i]) < 1e-6;
            const FltPixel f = plate.trueForeground->GetFlt(x, y);
            FltPixel &s = sum[y * kW + x];
            s = {s.R + f.R, s.G + f.G, s.B + f.B, s.A + f.A};
        });
        EXPECT_EQ(lowest, 0);
        EXPECT_LE(highest, *std::max_element(c.plateaus.begin(), c.plateaus.end()) + 1e-6);
        EXPECT_GT(partial, 50);
        for (size_t i = 0; i < c.plateaus.size(); ++i) EXPECT_GT(onPlateau[i], 50) << "plateau " << c.plateaus[i];
        if (c.onSampleGrid) {
            EXPECT_EQ(offGrid, 0);
            EXPECT_EQ(levels.size(), 17u);
        }
        if (c.area > 0) {
            EXPECT_NEAR(area / (kH * kH), c.area, c.tolerance * c.area);
        }
    }
    EachPixel([&](int x, int y) {
        ExpectPixelNear(all.trueForeground->GetFlt(x, y), sum[y * kW + x], 1e-6);
        EXPECT_NEAR(all.trueAlpha->GetFlt(x, y).A, sum[y * kW + x].A, 1e-6);
    });
}

// composite - spilled foreground - screen * (1 - alpha) is the grain: zero mean, the stated sigma. The spill is the
// screen's colour scaled, at most kSpillAtEdge of the alpha, and the foreground colours carry no screen hue.
TEST(KeyPlates, CompositeSpillAndScreen) {
    for (const ScreenColor screen : {ScreenColor::Green, ScreenColor::Blue})
        for (const double sigma : {0.0, 0.01, 0.03}) {
            SCOPED_TRACE(std::to_string(sigma) + (screen == ScreenColor::Green ? " green" : " blue"));
            const KeyPlate p = MakeKeyPlate(KeyPlateKind::Everything, screen, kW, kH, 11, sigma);
            const double base[3] = {p.screenR, p.screenG, p.screenB};
            const int key = screen == ScreenColor::Green ? 1 : 2;
            double sum = 0, squares = 0, light = 0, dimmest = 2, brightest = 0;
            double redTimesGreen = 0, hueError = 0, spillError = 0, spillOver = 0, keyExcess = 0;
            int fullSpill = 0, noSpill = 0;
            EachPixel([&](int x, int y) {
                const FltPixel c = p.composite->GetFlt(x, y), s = p.spilledForeground->GetFlt(x, y),
                               t = p.trueForeground->GetFlt(x, y), b = p.cleanScreen->GetFlt(x, y);
                const double a = p.trueAlpha->GetFlt(x, y).A, seen[3] = {c.R, c.G, c.B};
                const double lit[3] = {s.R, s.G, s.B}, clean[3] = {t.R, t.G, t.B}, bg[3] = {b.R, b.G, b.B};
                const double spill = (lit[key] - clean[key]) / bg[key];
                spillOver = std::max(spillOver, spill - kSpillAtEdge * a);
                fullSpill += a > 0.05 && spill > kSpillAtEdge * a - 1e-6;
                noSpill += a == 1 && spill == 0;
                double grain[3];
                for (int ch = 0; ch < 3; ++ch) {
                    grain[ch] = seen[ch] - lit[ch] - bg[ch] * (1 - a);
                    sum += grain[ch], squares += grain[ch] * grain[ch];
                    hueError = std::max(hueError, std::abs(bg[ch] / base[ch] - bg[key] / base[key]));
                    spillError = std::max(spillError, std::abs(lit[ch] - clean[ch] - spill * bg[ch]));
                }
                redTimesGreen += grain[0] * grain[1];
                const double otherMost = std::max(clean[key == 1 ? 2 : 1], clean[0]); // never keyed: some other
                if (a > 0.5) keyExcess = std::max(keyExcess, clean[key] - otherMost); // channel at least as high
                const double l = bg[key] / base[key];
                light += l, dimmest = std::min(dimmest, l), brightest = std::max(brightest, l);
                EXPECT_TRUE(c.A == 1 && s.A == t.A) << x << "," << y;
            });
            const double n = 3.0 * kW * kH;
            EXPECT_NEAR(sum / n, 0, 4 * sigma / std::sqrt(n) + 1e-7);
            EXPECT_NEAR(std::sqrt(squares / n), sigma, 0.03 * sigma + 1e-7);
            EXPECT_LT(std::abs(redTimesGreen) * 3 / n, 0.05 * sigma * sigma + 1e-12); // channels independent
            EXPECT_LT(hueError, 1e-5);                                                // one hue, lit unevenly
            EXPECT_LT(spillError, 1e-6); // the spill is the screen's colour
            EXPECT_LT(spillOver, 1e-6);  // at most kSpillAtEdge of the alpha
            EXPECT_GT(fullSpill, 20);
            EXPECT_GT(noSpill, 100);
            EXPECT_LT(keyExcess, 1e-6) << "screen-coloured foreground";
            EXPECT_NEAR(light / (kW * kH), 1, 1e-3);
            EXPECT_GE(dimmest, 1 - kScreenUnevenness);
            EXPECT_LE(brightest, 1 + kScreenUnevenness);
            EXPECT_GT(brightest / dimmest, 1.15);
        }
}

TEST(KeyPlates, ScoresOfKnownMattes) {
    const KeyPlate p = MakeKeyPlate(KeyPlateKind::Everything, ScreenColor::Green, kW, kH, 5);
    double sumA = 0, edgeSumA = 0, edgeSumRest = 0, largest = 0;
    int edges = 0;
    EachPixel([&](int x, int y) {
        const double a = p.trueAlpha->GetFlt(x, y).A;
        sumA += a, largest = std::max(largest, a);
        if (a > 0 && a < 1) edgeSumA += a, edgeSumRest += 1 - a, ++edges;
    });
    const double n = kW * kH;
    const auto constant = [](float v) { return [v](int, int) { return FltPixel{v, v, v, v}; }; };
    struct Case {
        const char *name;
        Ref<Image> matte;
        MatteScore want;
    };
    const Case cases[] = {
        {"truth", p.trueAlpha, {0, 0, 0}},
        {"opaque RGBA", MakeImage(DepthRGBAFlt32, constant(1)), {1 - sumA / n, 1, edgeSumRest / edges}},
        {"clear mask", MakeImage(DepthAFlt32, constant(0)), {sumA / n, largest, edgeSumA / edges}},
    };
    for (const Case &c : cases) {
        const MatteScore got = ScoreMatte(*c.matte, *p.trueAlpha);
        EXPECT_NEAR(got.meanError, c.want.meanError, 1e-9) << c.name;
        EXPECT_NEAR(got.worstError, c.want.worstError, 1e-9) << c.name;
        EXPECT_NEAR(got.edgeMeanError, c.want.edgeMeanError, 1e-9) << c.name;
    }
    EXPECT_TRUE(std::isnan(ScoreMatte(*MakeImage(DepthAFlt32, constant(1), kW, kH + 1), *p.trueAlpha).meanError));

    // The spilled foreground keeps all the spill, one halfway to the truth half of it.
    const Image &truth = *p.trueForeground, &spilled = *p.spilledForeground;
    const Ref<Image> half = MakeImage(DepthRGBAFlt32, [&](int x, int y) {
        const FltPixel t = truth.GetFlt(x, y), s = spilled.GetFlt(x, y);
        return FltPixel{(t.R + s.R) / 2, (t.G + s.G) / 2, (t.B + s.B) / 2, t.A};
    });
    const double full = EdgeColourDistance(spilled, p);
    EXPECT_EQ(EdgeColourDistance(truth, p), 0);
    EXPECT_GT(full, 0.02);
    EXPECT_NEAR(EdgeColourDistance(*half, p), full / 2, 1e-4 * full);
    EXPECT_TRUE(std::isnan(EdgeColourDistance(*MakeImage(DepthRGBAFlt32, constant(0), kW + 1, kH), p)));
}

} // namespace
} // namespace Orvane::keyplatestest
