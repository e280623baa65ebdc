// BrightnessContrast pixel values: the tool against an independent model of
// its steps, on every depth and every row function (the matrix route among
// them); forward then reverse; the edge settings.
#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include "tests/operators/color/BrightnessContrastReference.h"

namespace Orvane::bctest {
namespace {

class BrightnessContrastValues : public ::testing::Test {
protected:
    void SetUp() override { Orvane::Test::LoadOperators(); }
};

struct NamedSettings {
    const char *name;
    Settings s;
};

// Settings that cover each step alone and together. The ones without gamma or
// pre-divide take the matrix route (and on float only without clipping).
const NamedSettings kSettings[] = {
    {"gain and lift", {.gain = 1.7, .lift = 0.1}},
    {"gamma", {.gamma = 1.6}},
    {"gamma below one, negative lift", {.gain = 1.2, .lift = -0.05, .gamma = 0.6}},
    {"contrast and brightness", {.contrast = 0.4, .brightness = -0.1}},
    {"saturation", {.saturation = 0.3}},
    {"saturation, green off", {.saturation = 1.8, .green = false}},
    {"low and high", {.low = 0.1, .high = 0.8}},
    {"every step",
     {.gain = 1.3,
      .lift = 0.05,
      .gamma = 1.4,
      .contrast = 0.25,
      .brightness = 0.05,
      .saturation = 0.6,
      .low = 0.05,
      .high = 0.9}},
    {"every step, blue and alpha",
     {.gain = 0.8, .gamma = 0.7, .contrast = -0.3, .saturation = 1.5, .high = 0.7, .green = false, .alpha = true}},
    {"pre-divide", {.gain = 1.2, .gamma = 1.3, .saturation = 0.5, .prePost = true}},
    {"pre-divide, alpha processed", {.gain = 1.1, .lift = 0.02, .gamma = 0.8, .alpha = true, .prePost = true}},
    {"clip both", {.gain = 1.5, .lift = -0.2, .clipBlack = true, .clipWhite = true}},
    {"clip with gamma, alpha too",
     {.gamma = 2.0, .contrast = 0.5, .alpha = true, .clipBlack = true, .clipWhite = true}},
    {"alpha only", {.gain = 2.0, .saturation = 0.3, .red = false, .green = false, .blue = false, .alpha = true}},
    // Values whose 32-bit float lies just under a whole 16-bit step: the
    // 16-bit forms are cut from the float.
    {"lift and brightness on 16-bit steps", {.lift = 1000.0 / 65535.0, .gamma = 1.1, .brightness = 1004.0 / 65535.0}},
};

Settings Reversed(Settings s) {
    s.reverse = true;
    return s;
}

/// How a float result may differ from the model: float arithmetic against
/// double, the gamma table's accuracy, and the rounding of the stored depth.
double FloatTolerance(int depth, double expected, bool table, bool prePost) {
    double tol = 2e-5 * (1.0 + std::fabs(expected));
    // The table is exact to about 1e-6 on 0..1; after pre-divide the curve's
    // result is multiplied by colours that may be many times their stored size.
    if (table) tol += prePost ? 4e-5 : 4e-6;
    if (depth == DepthRGBAFlt16 || depth == DepthAFlt16) tol += std::fabs(expected) * (1.0 / 2048.0);
    return tol;
}

/// Compares every pixel of `out` with the model applied to `in`.
void ExpectModel(const Model &model, const Image &in, const Image &out, const std::string &what) {
    ASSERT_EQ(out.DataWindow(), in.DataWindow()) << what;
    const ImgRectI dw = out.DataWindow();
    const bool isFloat = out.IsFloat();
    const bool mask = out.IsMask();
    const int depth = out.Depth();
    int failures = 0;
    double worst = 0.0;
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            for (int c = mask ? 3 : 0; c < 4; ++c) {
                double got, expected, tol;
                if (isFloat) {
                    expected = model.Float(ToPx(in.GetFlt(x, y)))[c];
                    got = ToPx(out.GetFlt(x, y))[c];
                    tol = FloatTolerance(depth, expected, !model.truePower, model.s.prePost);
                } else {
                    std::array<int64_t, 4> p;
                    for (int k = 0; k < 4; ++k) p[k] = Stored16(in, x, y, k);
                    const double e16 = static_cast<double>(model.Int(p)[c]);
                    const bool eight = depth == DepthRGBAInt8 || depth == DepthAInt8;
                    expected = eight ? std::floor(e16 * 255.0 / 65535.0 + 0.5) : e16;
                    got = eight ? Stored16(out, x, y, c) / 257.0 : Stored16(out, x, y, c);
                    // Rows take the 16-bit steps themselves. The matrix route
                    // scales in float and rounds once where the steps cut:
                    // within a few units.
                    const bool rows = model.doGamma || model.s.prePost;
                    tol = eight ? (rows ? 0.0 : 1.0) : (rows ? 0.0 : 4.0);
                }
                const double err = std::fabs(got - expected);
                worst = std::max(worst, err / tol);
                if (!(err <= tol) && ++failures <= 3)
                    ADD_FAILURE() << what << " at (" << x << ", " << y << ") channel " << c << ": got " << got
                                  << ", expected " << expected;
            }
        }
    EXPECT_EQ(failures, 0) << what << " (worst error " << worst << " of the tolerance)";
}

TEST_F(BrightnessContrastValues, MatchesModelOnEveryDepthAndRowFunction) {
    struct Mode {
        const char *name;
        bool fastPower, vectorRows;
    };
    const Mode modes[] = {{"vector rows", true, true}, {"general rows", true, false}, {"gamma table", false, true}};
    const int depths[] = {DepthRGBAFlt32, DepthRGBAFlt16, DepthAFlt32, DepthAFlt16,
                          DepthRGBAInt16, DepthRGBAInt8,  DepthAInt16, DepthAInt8};
    for (const Mode &mode : modes) {
        AppSwitches switches(mode.fastPower, mode.vectorRows);
        for (int depth : depths) {
            // Integer depths read gamma from their table in every mode: one run is enough.
            if (!FormatOfDepth(depth).isFloat && &mode != &modes[0]) continue;
            Ref<Image> src = Orvane::Test::PatternImage(37, 11, depth, 7);
            Rig rig(src);
            for (const NamedSettings &named : kSettings)
                for (const Settings &s : {named.s, Reversed(named.s)}) {
                    Apply(rig.bc, s);
                    Ref<Image> out = Render(rig.bc);
                    const std::string what = std::string(named.name) + (s.reverse ? " reverse" : " forward") +
                                             ", depth " + std::to_string(depth) + ", " + mode.name;
                    ASSERT_TRUE(out) << what;
                    ExpectModel(Model(s, mode.fastPower), *src, *out, what);
                }
        }
    }
}

TEST_F(BrightnessContrastValues, ReverseUndoesForward) {
    const Settings invertible[] = {
        {.gain = 1.7, .lift = 0.1},
        {.gamma = 1.6},
        {.gain = 1.3, .lift = 0.05, .gamma = 0.7, .contrast = 0.25, .brightness = 0.05, .saturation = 0.6},
        {.contrast = -0.5, .saturation = 2.5, .low = 0.1, .high = 0.8},
        {.gain = 1.2, .gamma = 1.3, .saturation = 0.5, .prePost = true},
        {.gain = 0.6, .lift = -0.1, .gamma = 2.2, .alpha = true},
        {.saturation = 0.4, .red = false},
    };
    // Alpha kept away from 0, where pre-divide has nothing to undo.
    auto fill = [](int x, int y) {
        const float t = static_cast<float>(x * 13 + y * 7) / 97.f;
        return FltPixel{-0.2f + std::fmod(t, 1.4f), std::fmod(t * 3.1f, 1.2f), 1.1f - std::fmod(t * 1.7f, 1.3f),
                        0.3f + std::fmod(t * 0.9f, 0.9f)};
    };
    Ref<Image> src = MakeImage(31, 9, DepthRGBAFlt32, fill);
    for (bool vectorRows : {true, false}) {
        AppSwitches switches(true, vectorRows);
        for (const Settings &s : invertible) {
            Rig rig(src);
            Operator *back = rig.AddAfter(rig.bc);
            Apply(rig.bc, s);
            Apply(back, Reversed(s));
            Ref<Image> out = Render(back);
            ASSERT_TRUE(out);
            double worst = 0.0;
            for (int y = 0; y < 9; ++y)
                for (int x = 0; x < 31; ++x) {
                    const Px a = ToPx(src->GetFlt(x, y)), b = ToPx(out->GetFlt(x, y));
                    for (int c = 0; c < 4; ++c) worst = std::max(worst, std::fabs(a[c] - b[c]));
                }
            EXPECT_LE(worst, 1e-4) << "gain " << s.gain << " gamma " << s.gamma << " sat " << s.saturation;
            EXPECT_NE(out.Get(), src.Get());
        }
    }
}

TEST_F(BrightnessContrastValues, EdgeSettings) {
    struct Edge {
        const char *name;
        FltPixel in, expected;
        bool fastPower;
        Settings s;
    };
    // 0.99999 to the power 100000: about 1/e, where a larger exponent gives 0.
    const float kNearOne = static_cast<float>(std::pow(static_cast<double>(0.99999f), 100000.0));
    const FltPixel a{0.5f, 0.99999f, 1.0f, 0.3f}, b{0.1f, 0.5f, 1.9f, 0.7f}, c{1.f, 0.25f, -0.5f, 1.f};
    const FltPixel tiny{1e-8f, 1e-8f, 1e-8f, 1e-8f}, signs{-0.5f, 0.5f, -2.f, 1.f};
    const Settings alphaOnly{.gain = 2, .saturation = 0.3, .red = false, .green = false, .blue = false, .alpha = true};
    const Settings contrastBack{.contrast = -1, .brightness = 0.1, .reverse = true};
    const Settings tinyAlpha{.gain = 2.0, .lift = 0.5, .alpha = true, .prePost = true};
    const Edge edges[] = {
        {"alpha only: saturation leaves alpha", {0.2f, 0.4f, 0.6f, 0.5f}, {0.2f, 0.4f, 0.6f, 1.f}, true, alphaOnly},
        {"gamma 0 forward: exponent 100000", a, {0.f, kNearOne, 1.f, 0.3f}, true, {.gamma = 0.0}},
        {"gamma 0 forward, table", a, {0.f, kNearOne, 1.f, 0.3f}, false, {.gamma = 0.0}},
        {"high equals low forward", b, {0.f, 0.f, 0.f, 0.7f}, true, {.low = 0.4, .high = 0.4}},
        {"high equals low reverse", b, {0.4f, 0.4f, 0.4f, 0.7f}, true, {.low = 0.4, .high = 0.4, .reverse = true}},
        {"gain equals lift forward", b, {0.3f, 0.3f, 0.3f, 0.7f}, true, {.gain = 0.3, .lift = 0.3}},
        {"gain = lift reverse: 1", b, {-0.2f, 0.2f, 1.6f, 0.7f}, true, {.gain = 0.3, .lift = 0.3, .reverse = true}},
        {"contrast -1 forward", b, {0.6f, 0.6f, 0.6f, 0.7f}, true, {.contrast = -1.0, .brightness = 0.1}},
        {"contrast -1 reverse: 1", b, {0.f, 0.4f, 1.8f, 0.7f}, true, contrastBack},
        {"pre-divide, alpha 0", {.3f, .5f, .7f, 0}, {}, true, {.gain = 2, .lift = .1, .gamma = 1.2, .prePost = true}},
        {"pre-divide, alpha below eps", tiny, {0.f, 0.f, 0.f, 1e-8f}, true, {.gain = 2, .lift = 0.1, .prePost = true}},
        // Processed alpha grows from the lift, so the colours show that they
        // started from 0: lift times the new alpha.
        {"pre-divide, alpha below eps, processed", tiny, {0.25f, 0.25f, 0.25f, 0.5f}, true, tinyAlpha},
        {"negative stays negative with true powers", signs, {-0.25f, 0.25f, -4.f, 1.f}, true, {.gamma = 0.5}},
        {"negative reads as 0 from the table", signs, {0.f, 0.25f, 0.f, 1.f}, false, {.gamma = 0.5}},
        {"clip white", c, {1.f, 0.5f, -1.f, 1.f}, true, {.gain = 2.0, .clipWhite = true}},
        {"no clip: float has no ceiling", c, {2.f, 0.5f, -1.f, 1.f}, true, {.gain = 2.0}},
        {"clip black", c, {2.f, 0.5f, 0.f, 1.f}, true, {.gain = 2.0, .clipBlack = true}},
    };
    for (const Edge &e : edges) {
        AppSwitches switches(e.fastPower, true);
        Rig rig(MakeImage(5, 3, DepthRGBAFlt32, [&](int, int) { return e.in; }));
        Apply(rig.bc, e.s);
        Ref<Image> out = Render(rig.bc);
        ASSERT_TRUE(out) << e.name;
        const Px got = ToPx(out->GetFlt(2, 1)), want = ToPx(e.expected);
        for (int c = 0; c < 4; ++c)
            EXPECT_NEAR(got[c], want[c], 2e-6 * (1 + std::fabs(want[c]))) << e.name << " channel " << c;
    }
}

} // namespace
} // namespace Orvane::bctest
