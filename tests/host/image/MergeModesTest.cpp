// The merge's pixel formulas against values computed here, in double, from
// the definitions in docs/MERGE.md written the other way round: the
// separable modes through straight colours (the code expands them on
// premultiplied values), the non-separable ones with sorted channels, the
// operators from their Porter-Duff factors. Then whole images: every depth,
// canvas colours and data windows, offsets, the copy beyond the foreground,
// the depth merge, Dissolve's noise.
#include "host/image/MergeModes.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cmath>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/image/Half.h"
#include "host/image/NewImage.h"

namespace Orvane::mergetest {
namespace {

using D4 = std::array<double, 4>;

D4 D(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }
FltPixel F(const D4 &d) {
    return {static_cast<float>(d[0]), static_cast<float>(d[1]), static_cast<float>(d[2]), static_cast<float>(d[3])};
}

// ---- the reference ----

double Straight(double c, double a) { return a != 0.0 ? c / a : 0.0; }

double ScreenD(double x, double y) { return x + y - x * y; }
double HardLightD(double b, double s) { return s <= 0.5 ? b * 2 * s : ScreenD(b, 2 * s - 1); }

/// B(Cb, Cs) of a separable mode, on straight colour.
double Separable(int mode, double cb, double cs) {
    switch (mode) {
    case MrgNormal: return cs;
    case MrgScreen: return ScreenD(cb, cs);
    case MrgMultiply: return cb * cs;
    case MrgOverlay: return HardLightD(cs, cb);
    case MrgHardLight: return HardLightD(cb, cs);
    case MrgSoftLight: {
        if (cs <= 0.5) return cb - (1 - 2 * cs) * cb * (1 - cb);
        const double d = cb <= 0.25 ? ((16 * cb - 12) * cb + 4) * cb : std::sqrt(cb);
        return cb + (2 * cs - 1) * (d - cb);
    }
    case MrgColorDodge: return cb == 0 ? 0 : cs >= 1 ? 1 : std::min(1.0, cb / (1 - cs));
    case MrgColorBurn: return cb >= 1 ? 1 : cs <= 0 ? 0 : 1 - std::min(1.0, (1 - cb) / cs);
    case MrgDarken: return std::min(cb, cs);
    case MrgLighten: return std::max(cb, cs);
    case MrgDifference: return std::fabs(cb - cs);
    case MrgExclusion: return cb + cs - 2 * cb * cs;
    case MrgAdd: return cb + cs;
    case MrgSubtract: return cb - cs;
    default: ADD_FAILURE() << "not separable: " << mode; return 0;
    }
}

using RGB = std::array<double, 3>;
double Lum(const RGB &c) { return 0.2126 * c[0] + 0.7152 * c[1] + 0.0722 * c[2]; }
RGB ClipColorD(RGB c) {
    const double l = Lum(c), n = std::min({c[0], c[1], c[2]});
    if (n < 0) {
        if (l <= 0) return {0, 0, 0};
        for (double &v : c) v = l + (v - l) * l / (l - n);
    }
    return c;
}
RGB SetLumD(RGB c, double l) {
    const double d = l - Lum(c);
    for (double &v : c) v += d;
    return ClipColorD(c);
}
double SatD(const RGB &c) { return std::max({c[0], c[1], c[2]}) - std::min({c[0], c[1], c[2]}); }
/// By sorting the channels: the largest gets s, the smallest 0, the middle
/// its share.
RGB SetSatD(const RGB &c, double s) {
    int idx[3] = {0, 1, 2};
    std::sort(idx, idx + 3, [&c](int a, int b) { return c[a] < c[b]; });
    RGB r{};
    const double lo = c[idx[0]], mid = c[idx[1]], hi = c[idx[2]];
    if (hi > lo) {
        r[idx[1]] = mid == hi ? s : (mid - lo) * s / (hi - lo);
        r[idx[2]] = s;
    }
    return r;
}

RGB NonSeparable(int mode, const RGB &cb, const RGB &cs) {
    switch (mode) {
    case MrgHue: return SetLumD(SetSatD(cs, SatD(cb)), Lum(cb));
    case MrgSaturation: return SetLumD(SetSatD(cb, SatD(cs)), Lum(cb));
    case MrgColor: return SetLumD(cs, Lum(cb));
    default: return SetLumD(cb, Lum(cs));
    }
}

bool IsNonSeparable(int mode) { return mode >= MrgHue && mode <= MrgLuminosity; }

struct Controls {
    int mode = MrgNormal, op = MrgOver;
    double blend = 1, additive = 0, alphaGain = 1, burnIn = 0;
    bool on[4] = {true, true, true, true};
};

MergeSettings SettingsOf(const Controls &c) {
    MergeSettings s;
    s.mode = c.mode;
    s.op = c.op;
    s.blend = static_cast<float>(c.blend);
    s.additive = static_cast<float>(c.additive);
    s.alphaGain = static_cast<float>(c.alphaGain);
    s.burnIn = static_cast<float>(c.burnIn);
    for (int i = 0; i < 4; ++i) s.channels[i] = c.on[i];
    return s;
}

TagList TagsOf(const Controls &c) {
    return TagList{{MrgApplyMode, c.mode},      {MrgOperator, c.op},   {MrgBlend, c.blend}, {MrgAdditive, c.additive},
                   {MrgAlphaGain, c.alphaGain}, {MrgBurnIn, c.burnIn}, {MrgDoRed, c.on[0]}, {MrgDoGreen, c.on[1]},
                   {MrgDoBlue, c.on[2]},        {MrgDoAlpha, c.on[3]}};
}

/// The merge of one pixel (not Dissolve), straight from the definitions.
D4 Reference(const Controls &c, const D4 &f, const D4 &b) {
    const double as = f[3], ab = b[3];
    const double hc = (1 - c.additive) * (1 - c.burnIn), kk = 1 - c.burnIn, fa = c.alphaGain * (1 - c.burnIn);
    D4 o{};
    if (c.mode == MrgNormal) {
        // Porter-Duff: a share X of the foreground, Y of the background.
        double x = 1, yColour = 0, yAlpha = 0;
        const bool heldOut = c.op == MrgOver || c.op == MrgAtop || c.op == MrgXOr;
        if (c.op == MrgIn || c.op == MrgAtop) x = ab;
        if (c.op == MrgHeldOut || c.op == MrgXOr) x = 1 - ab;
        if (heldOut) yColour = 1 - hc * as, yAlpha = 1 - kk * as;
        for (int i = 0; i < 3; ++i) o[i] = x * f[i] + yColour * b[i];
        o[3] = fa * x * as + yAlpha * ab;
    } else {
        RGB cs, cb;
        for (int i = 0; i < 3; ++i) cs[i] = Straight(f[i], as), cb[i] = Straight(b[i], ab);
        RGB mixed;
        if (IsNonSeparable(c.mode))
            mixed = NonSeparable(c.mode, cb, cs);
        else
            for (int i = 0; i < 3; ++i) mixed[i] = Separable(c.mode, cb[i], cs[i]);
        for (int i = 0; i < 3; ++i) o[i] = f[i] * (1 - ab) + b[i] * (1 - hc * as) + as * ab * mixed[i];
        o[3] = fa * as + (1 - kk * as) * ab;
    }
    for (int i = 0; i < 4; ++i) {
        o[i] = b[i] + c.blend * (o[i] - b[i]);
        if (!c.on[i]) o[i] = b[i];
    }
    return o;
}

::testing::AssertionResult Near4(const FltPixel &got, const D4 &want, double tol = 2e-6) {
    for (int i = 0; i < 4; ++i) {
        const double g = D(got)[i];
        if (!(std::fabs(g - want[i]) <= tol * std::max(1.0, std::fabs(want[i]))))
            return ::testing::AssertionFailure() << "channel " << i << ": got " << g << ", want " << want[i] << " (got "
                                                 << got.R << " " << got.G << " " << got.B << " " << got.A << ")";
    }
    return ::testing::AssertionSuccess();
}

/// Pairs that reach every branch: halves of the light modes on both sides
/// of 1/2, Soft Light's polynomial below 1/4, dodges at 0 and 1, empty and
/// opaque alphas, values above 1.
const std::vector<std::pair<D4, D4>> &Pairs() {
    static const std::vector<std::pair<D4, D4>> pairs = {
        {{0.12, 0.30, 0.45, 0.6}, {0.08, 0.56, 0.32, 0.8}}, // Cs .2 .5 .75, Cb .1 .7 .4
        {{0.9, 0.1, 0.5, 1.0}, {0.2, 0.6, 1.0, 1.0}},       // opaque over opaque
        {{0.25, 0.05, 0.2, 0.5}, {0, 0, 0, 0}},             // empty background
        {{0, 0, 0, 0}, {0.3, 0.2, 0.1, 0.5}},               // empty foreground
        {{1.5, 0.2, 0.0, 1.0}, {2.0, 0.5, 0.25, 1.0}},      // above 1
        {{0.35, 0.7, 0.0, 0.7}, {0.0, 0.45, 0.9, 0.9}},     // Cs 1 (dodge), Cb 0 (dodge, burn)
        {{0.06, 0.24, 0.18, 0.3}, {0.9, 0.05, 0.5, 1.0}},   // mixed
    };
    return pairs;
}

TEST(MergeModes, EveryModeAndOperatorMatchesItsDefinition) {
    for (int mode = 0; mode < MrgModeCount; ++mode) {
        if (mode == MrgDissolve) continue;
        const int ops = mode == MrgNormal ? MrgOperatorCount : 1;
        for (int op = 0; op < ops; ++op)
            for (const auto &[f, b] : Pairs()) {
                Controls c;
                c.mode = mode;
                c.op = op;
                SCOPED_TRACE("mode " + std::to_string(mode) + " op " + std::to_string(op));
                EXPECT_TRUE(Near4(MergePixel(SettingsOf(c), F(f), F(b), 0, 0), Reference(c, f, b)));
            }
    }
}

TEST(MergeModes, HandComputedPixels) {
    const MergeSettings over;
    // Half-transparent red over opaque blue: red 0.5, blue 1 x (1 - 0.5).
    EXPECT_EQ(MergePixel(over, {0.5f, 0, 0, 0.5f}, {0, 0, 1, 1}, 0, 0), (FltPixel{0.5f, 0, 0.5f, 1}));
    MergeSettings s;
    s.mode = MrgScreen; // opaque: 0.5 + 0.5 - 0.25
    EXPECT_EQ(MergePixel(s, {0.5f, 0.5f, 0.5f, 1}, {0.5f, 0.25f, 0, 1}, 0, 0), (FltPixel{0.75f, 0.625f, 0.5f, 1}));
    s.mode = MrgMultiply;
    EXPECT_EQ(MergePixel(s, {0.5f, 0.5f, 0.5f, 1}, {0.5f, 0.25f, 0, 1}, 0, 0), (FltPixel{0.25f, 0.125f, 0, 1}));
    s.mode = MrgDifference;
    EXPECT_EQ(MergePixel(s, {0.25f, 0.75f, 0, 1}, {1, 0.25f, 0.5f, 1}, 0, 0), (FltPixel{0.75f, 0.5f, 0.5f, 1}));
    s.mode = MrgAdd; // no clipping on float
    EXPECT_EQ(MergePixel(s, {0.75f, 0, 0, 1}, {0.5f, 0, 0, 1}, 0, 0), (FltPixel{1.25f, 0, 0, 1}));
    s.mode = MrgSubtract;
    EXPECT_EQ(MergePixel(s, {0.25f, 0, 0, 1}, {0.5f, 0, 0, 1}, 0, 0), (FltPixel{0.25f, 0, 0, 1}));
    // In keeps the foreground where the background has alpha; Held Out
    // where it has none.
    s = MergeSettings();
    s.op = MrgIn;
    EXPECT_EQ(MergePixel(s, {0.5f, 0.5f, 0, 1}, {0, 0, 1, 0.5f}, 0, 0), (FltPixel{0.25f, 0.25f, 0, 0.5f}));
    s.op = MrgHeldOut;
    EXPECT_EQ(MergePixel(s, {0.5f, 0.5f, 0, 1}, {0, 0, 1, 0.5f}, 0, 0), (FltPixel{0.25f, 0.25f, 0, 0.5f}));
}

TEST(MergeModes, AdditiveAlphaGainAndBurnIn) {
    const D4 f{0.4, 0.2, 0.1, 0.5}, b{0.3, 0.6, 0.2, 0.75};
    Controls c;
    c.additive = 1; // colour added, alpha as over
    EXPECT_TRUE(Near4(MergePixel(SettingsOf(c), F(f), F(b), 0, 0), {0.7, 0.8, 0.3, 0.5 + 0.75 * 0.5}));
    c.additive = 0.25; // the background held out by 0.75 x alpha
    EXPECT_TRUE(Near4(MergePixel(SettingsOf(c), F(f), F(b), 0, 0),
                      {0.4 + 0.3 * (1 - 0.375), 0.2 + 0.6 * 0.625, 0.1 + 0.2 * 0.625, 0.875}));
    c = Controls();
    c.alphaGain = 0; // no coverage added; the background's alpha still held out
    EXPECT_TRUE(Near4(MergePixel(SettingsOf(c), F(f), F(b), 0, 0), {0.55, 0.5, 0.2, 0.375}));
    c = Controls();
    c.burnIn = 1; // light printed on: colours add, the alpha stays the background's
    EXPECT_TRUE(Near4(MergePixel(SettingsOf(c), F(f), F(b), 0, 0), {0.7, 0.8, 0.3, 0.75}));
    // Everything at once, through the reference.
    c = Controls();
    c.additive = 0.3, c.alphaGain = 0.6, c.burnIn = 0.2, c.blend = 0.7;
    for (int mode : {MrgNormal, MrgScreen, MrgOverlay, MrgHue}) {
        c.mode = mode;
        EXPECT_TRUE(Near4(MergePixel(SettingsOf(c), F(f), F(b), 0, 0), Reference(c, f, b))) << mode;
    }
}

TEST(MergeModes, BlendAndChannels) {
    const FltPixel f{0.4f, 0.2f, 0.1f, 0.5f}, b{0.3f, 0.6f, 0.2f, 0.75f};
    Controls c;
    c.mode = MrgMultiply;
    c.blend = 0; // exactly the background
    EXPECT_EQ(MergePixel(SettingsOf(c), f, b, 0, 0), b);
    c.blend = 0.25;
    const D4 full = Reference(Controls{MrgMultiply}, D(f), D(b));
    D4 quarter;
    for (int i = 0; i < 4; ++i) quarter[i] = D(b)[i] * 0.75 + full[i] * 0.25;
    EXPECT_TRUE(Near4(MergePixel(SettingsOf(c), f, b, 0, 0), quarter));
    c.blend = 1;
    c.on[1] = c.on[3] = false; // green and alpha stay the background's
    const FltPixel got = MergePixel(SettingsOf(c), f, b, 0, 0);
    EXPECT_EQ(got.G, b.G);
    EXPECT_EQ(got.A, b.A);
    EXPECT_TRUE(Near4(got, {full[0], b.G, full[2], b.A}));
}

TEST(MergeModes, NonSeparableModesKeepTheirParts) {
    // Independent of the code's own helpers: Luminosity keeps the
    // background's hue and saturation and takes the foreground's luminance.
    const D4 f{0.2, 0.6, 0.4, 1}, b{0.9, 0.5, 0.3, 1}; // no channel leaves the gamut on the way
    for (int mode : {MrgColor, MrgLuminosity, MrgHue, MrgSaturation}) {
        MergeSettings s;
        s.mode = mode;
        const FltPixel o = MergePixel(s, F(f), F(b), 0, 0);
        const RGB out{o.R, o.G, o.B};
        const RGB fs{f[0], f[1], f[2]}, bs{b[0], b[1], b[2]};
        SCOPED_TRACE(mode);
        if (mode == MrgLuminosity || mode == MrgColor) {
            EXPECT_NEAR(Lum(out), Lum(mode == MrgLuminosity ? fs : bs), 1e-6);
        }
        if (mode == MrgColor || mode == MrgHue || mode == MrgSaturation) {
            EXPECT_NEAR(Lum(out), Lum(bs), 1e-6);
        }
        if (mode == MrgSaturation) {
            EXPECT_NEAR(SatD(out), SatD(fs), 1e-6);
        }
        if (mode == MrgHue || mode == MrgLuminosity) {
            EXPECT_NEAR(SatD(out), SatD(bs), 1e-6);
        }
    }
}

// ---- Dissolve ----

/// The noise as the page defines it, written out again.
double NoiseRef(int x, int y) {
    uint32_t u = static_cast<uint32_t>(x) * 0x9E3779B1u + static_cast<uint32_t>(y) * 0x85EBCA77u;
    u ^= u >> 16;
    u *= 0x7FEB352Du;
    u ^= u >> 15;
    u *= 0x846CA68Bu;
    u ^= u >> 16;
    return (u >> 8) / 16777216.0;
}

TEST(MergeModes, DissolveKeepsWholePixelsByTheNoise) {
    MergeSettings s;
    s.mode = MrgDissolve;
    s.blend = 0.8f;
    const FltPixel f{0.3f, 0.15f, 0.6f, 0.75f}, b{0.1f, 0.2f, 0.3f, 1.f};
    const double p = static_cast<double>(0.8f * 0.75f);
    int kept = 0, n = 0;
    for (int y = -40; y < 40; ++y)
        for (int x = -60; x < 60; ++x, ++n) {
            ASSERT_EQ(DissolveNoise(x, y), static_cast<float>(NoiseRef(x, y)));
            const FltPixel o = MergePixel(s, f, b, x, y);
            if (NoiseRef(x, y) < p) {
                ++kept;
                ASSERT_TRUE(Near4(o, {0.4, 0.2, 0.8, 1})) << x << "," << y; // straight colour, opaque
            } else {
                ASSERT_EQ(o, b) << x << "," << y;
            }
        }
    // The share kept is the chance, within a few standard deviations.
    EXPECT_NEAR(kept / double(n), p, 4 * std::sqrt(p * (1 - p) / n));
    // The canvas is the mean.
    const FltPixel mean = MergeCanvasColor(s, f, b);
    EXPECT_TRUE(Near4(mean, {0.1 + p * 0.3, 0.2, 0.3 + p * 0.5, 1}));
}

// ---- whole images ----

Ref<Image> Filled(int depth, const ImgRectI &window, const std::function<FltPixel(int, int)> &px,
                  FltPixel canvas = {}) {
    Ref<Image> img = NewImageTagList({{ImgWidth, 16}, {ImgHeight, 12}, {ImgDepth, depth}, {ImgDataWindow, &window}});
    img->AllocScanLineData();
    img->SetCanvasColor(canvas);
    for (int y = window.y0; y < window.y1; ++y)
        for (int x = window.x0; x < window.x1; ++x) img->PutFlt(x, y, px(x, y));
    return img;
}

FltPixel FgAt(int x, int y) { return {0.05f * (x % 7), 0.04f * (y % 9), 0.3f, 0.25f + 0.05f * ((x + y) % 10)}; }
FltPixel BgAt(int x, int y) { return {0.9f - 0.03f * x, 0.1f + 0.02f * y, 0.5f, 0.2f + 0.06f * (x % 12)}; }

Ref<Image> Output(int depth, const ImgRectI &window) {
    return NewImageTagList({{ImgWidth, 16}, {ImgHeight, 12}, {ImgDepth, depth}, {ImgDataWindow, &window}});
}

/// Whether a stored component is the value computed here, stored at
/// `depth`: an integer depth must hold the nearest code of the clamped value
/// (within half a code, so the code beside it fails), a half the nearest
/// half (within half a step), a float the value within a few ulps.
::testing::AssertionResult StoredNear(int depth, double got, double want) {
    double tol;
    switch ((depth - 1) % 4) {
    case 0: want = std::clamp(want, 0.0, 1.0), tol = 0.5 / 255 + 1e-6; break;
    case 1: want = std::clamp(want, 0.0, 1.0), tol = 0.5 / 65535 + 1e-7; break;
    case 2: tol = std::ldexp(1.0, std::ilogb(std::max(std::fabs(want), 1e-4)) - 11) + 1e-7; break;
    default: tol = 2e-6 * std::max(1.0, std::fabs(want)); break;
    }
    if (std::fabs(got - want) <= tol) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "got " << got << ", want " << want << " (depth " << depth << ")";
}

TEST(MergeImages, EveryDepthRoundsTheFloatResult) {
    const ImgRectI win(0, 0, 16, 12);
    for (int depth = 1; depth <= 8; ++depth)
        for (int mode : {MrgNormal, MrgScreen, MrgOverlay, MrgColor}) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " mode " + std::to_string(mode));
            // Inputs quantised at the depth first, so the reference sees what the rows read.
            Ref<Image> fg = Filled(depth, win, FgAt), bg = Filled(depth, win, BgAt);
            Ref<Image> out = Output(depth, win);
            Controls c;
            c.mode = mode;
            ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), out.Get(), TagsOf(c)));
            for (int y = win.y0; y < win.y1; ++y)
                for (int x = win.x0; x < win.x1; ++x) {
                    const D4 want = Reference(c, D(fg->GetFlt(x, y)), D(bg->GetFlt(x, y)));
                    const D4 got = D(out->GetFlt(x, y));
                    for (int i = 0; i < 4; ++i) {
                        const double w = depth <= 4 ? want[3] : want[i]; // masks hold alpha
                        ASSERT_TRUE(StoredNear(depth, got[i], w)) << x << "," << y << " ch " << i;
                    }
                }
        }
}

TEST(MergeImages, MixedDepthsWriteTheBackgroundsDepth) {
    const ImgRectI win(2, 1, 14, 11);
    Ref<Image> fg = Filled(DepthRGBAFlt32, win, FgAt), bg = Filled(DepthRGBAInt16, win, BgAt);
    Ref<Image> out = Output(DepthRGBAInt16, win);
    ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), out.Get(), TagsOf(Controls{})));
    for (int y = win.y0; y < win.y1; ++y)
        for (int x = win.x0; x < win.x1; ++x) {
            const D4 want = Reference(Controls{}, D(fg->GetFlt(x, y)), D(bg->GetFlt(x, y)));
            for (int i = 0; i < 4; ++i) ASSERT_TRUE(StoredNear(DepthRGBAInt16, D(out->GetFlt(x, y))[i], want[i]));
        }
}

TEST(MergeImages, CanvasColoursMergeAndFillBeyondTheWindows) {
    // The foreground sits left, the background right; both have canvases.
    const ImgRectI fw(0, 0, 6, 12), bw(4, 2, 16, 10);
    const FltPixel fc{0.1f, 0.1f, 0.0f, 0.25f}, bc{0.0f, 0.2f, 0.4f, 0.5f};
    for (int mode : {MrgNormal, MrgMultiply, MrgSoftLight}) {
        Ref<Image> fg = Filled(DepthRGBAFlt32, fw, FgAt, fc), bg = Filled(DepthRGBAFlt32, bw, BgAt, bc);
        Controls c;
        c.mode = mode;
        const MergeSettings s = SettingsOf(c);
        const ImgRectI out = MergeDataWindow(s, fw, fc, bw, bc);
        EXPECT_EQ(out, ImgRectI(0, 0, 16, 12));
        Ref<Image> dst = Output(DepthRGBAFlt32, out);
        ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dst.Get(), TagsOf(c)));
        EXPECT_TRUE(Near4(dst->GetCanvasColor(), Reference(c, D(fc), D(bc))));
        for (int y = 0; y < 12; ++y)
            for (int x = 0; x < 16; ++x) {
                const FltPixel f = fw.Contains(x, y) ? FgAt(x, y) : fc, b = bw.Contains(x, y) ? BgAt(x, y) : bc;
                ASSERT_TRUE(Near4(dst->GetFlt(x, y), Reference(c, D(f), D(b)))) << mode << " " << x << "," << y;
            }
    }
}

TEST(MergeImages, DataWindowsFollowWhatCanDifferFromTheCanvas) {
    const ImgRectI fw(0, 0, 6, 6), bw(4, 4, 10, 10);
    const FltPixel clear{}, grey{0.5f, 0.5f, 0.5f, 1};
    MergeSettings s;
    EXPECT_EQ(MergeDataWindow(s, fw, clear, bw, clear), ImgRectI(0, 0, 10, 10)); // over: the union
    s.op = MrgIn;
    EXPECT_EQ(MergeDataWindow(s, fw, clear, bw, clear), ImgRectI(4, 4, 6, 6)); // both sides cut
    EXPECT_EQ(MergeDataWindow(s, fw, clear, bw, grey), ImgRectI(0, 0, 6, 6));  // the background's canvas shows
    s.op = MrgAtop;
    EXPECT_EQ(MergeDataWindow(s, fw, clear, bw, clear), bw);
    s.op = MrgHeldOut;
    EXPECT_EQ(MergeDataWindow(s, fw, clear, bw, clear), fw);
    s.blend = 0.5f; // half the background stays everywhere
    EXPECT_EQ(MergeDataWindow(s, fw, clear, bw, clear), ImgRectI(0, 0, 10, 10));
    // What the rule cuts away really is the canvas: In over windows that do
    // not meet leaves nothing.
    s = MergeSettings();
    s.op = MrgIn;
    EXPECT_TRUE(MergeDataWindow(s, ImgRectI(0, 0, 3, 3), clear, ImgRectI(5, 5, 8, 8), clear).IsNull());
}

TEST(MergeImages, OffsetsPlaceTheForeground) {
    const ImgRectI fw(0, 0, 4, 3), bw(0, 0, 16, 12);
    Ref<Image> fg = Filled(DepthRGBAFlt32, fw, FgAt), bg = Filled(DepthRGBAFlt32, bw, BgAt);
    Ref<Image> dst = Output(DepthRGBAFlt32, bw);
    TagList tags = TagsOf(Controls{});
    tags.Set({MrgFgOffsetX, 5});
    tags.Set({MrgFgOffsetY, -1}); // the bottom row falls off
    ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dst.Get(), tags));
    for (int y = 0; y < 12; ++y)
        for (int x = 0; x < 16; ++x) {
            const bool under = x >= 5 && x < 9 && y >= 0 && y < 2;
            const FltPixel f = under ? FgAt(x - 5, y + 1) : FltPixel{};
            ASSERT_TRUE(Near4(dst->GetFlt(x, y), Reference(Controls{}, D(f), D(BgAt(x, y))))) << x << "," << y;
            if (!under) {
                ASSERT_EQ(dst->GetFlt(x, y), BgAt(x, y)); // copied as it is
            }
        }
}

TEST(MergeImages, CopiedBackgroundEqualsTheComputedMerge) {
    // Beyond a clear foreground the rows copy the background. The same
    // foreground padded with clear pixels over the whole frame makes them
    // compute every pixel: both must give the same bits, integer and half
    // backgrounds included, and the copy must be the background.
    const ImgRectI fw(3, 2, 9, 7), bw(0, 0, 16, 12);
    for (int depth : {DepthRGBAInt8, DepthRGBAFlt16, DepthAInt16, DepthRGBAFlt32}) {
        for (int mode : {MrgNormal, MrgScreen, MrgColorBurn}) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " mode " + std::to_string(mode));
            Ref<Image> fg = Filled(DepthRGBAFlt32, fw, FgAt), bg = Filled(depth, bw, BgAt);
            Ref<Image> padded =
                Filled(DepthRGBAFlt32, bw, [&](int x, int y) { return fw.Contains(x, y) ? FgAt(x, y) : FltPixel{}; });
            Controls c;
            c.mode = mode;
            Ref<Image> copied = Output(depth, bw), computed = Output(depth, bw);
            ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), copied.Get(), TagsOf(c)));
            ASSERT_TRUE(MergeImagesTagList(padded.Get(), bg.Get(), computed.Get(), TagsOf(c)));
            for (int y = 0; y < 12; ++y)
                for (int x = 0; x < 16; ++x) {
                    ASSERT_EQ(copied->GetFlt(x, y), computed->GetFlt(x, y)) << x << "," << y;
                    if (!fw.Contains(x, y)) {
                        ASSERT_EQ(copied->GetFlt(x, y), bg->GetFlt(x, y)) << x << "," << y;
                    }
                }
        }
    }
}

TEST(MergeImages, DepthMergeLetsTheNearerWin) {
    const ImgRectI win(0, 0, 4, 1);
    auto zImage = [&](const std::vector<FltPixel> &px, const std::vector<float> &z) {
        Ref<Image> img = Filled(DepthRGBAFlt32, win, [&](int x, int) { return px[x]; });
        img->AddAuxChannel(AuxChannelKind::Z);
        for (int x = 0; x < 4; ++x) img->AuxRow(AuxChannelKind::Z, 0)[x] = z[x];
        return img;
    };
    const FltPixel fp{0.4f, 0.2f, 0.0f, 0.8f}, bp{0.0f, 0.3f, 0.6f, 0.6f};
    // x 0: the foreground nearer; 1: the background nearer; 2: a tie; 3: the
    // foreground nearer but empty.
    Ref<Image> fg = zImage({fp, fp, fp, FltPixel{}}, {1, 5, 3, 0.5f});
    Ref<Image> bg = zImage({bp, bp, bp, bp}, {2, 4, 3, 2});
    for (bool larger : {false, true}) {
        Ref<Image> dst = Output(DepthRGBAFlt32, win);
        TagList tags = TagsOf(Controls{});
        tags.Set({MrgZMerge, 1});
        tags.Set({MrgZLargerIsNearer, larger});
        ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dst.Get(), tags));
        ASSERT_TRUE(dst->HasAuxChannel(AuxChannelKind::Z));
        const D4 fgOver = Reference(Controls{}, D(fp), D(bp));
        const D4 bgOver{0.0 + 0.4 * 0.4, 0.3 + 0.4 * 0.2, 0.6, 0.6 + 0.4 * 0.8};
        const bool fgNearAt0 = !larger, fgNearAt1 = larger;
        EXPECT_TRUE(Near4(dst->GetFlt(0, 0), fgNearAt0 ? fgOver : bgOver));
        EXPECT_TRUE(Near4(dst->GetFlt(1, 0), fgNearAt1 ? fgOver : bgOver));
        EXPECT_TRUE(Near4(dst->GetFlt(2, 0), fgOver)); // tie: the foreground
        EXPECT_EQ(dst->GetFlt(3, 0), bp);              // an empty foreground never wins
        const float *z = dst->AuxRow(AuxChannelKind::Z, 0);
        EXPECT_EQ(z[0], fgNearAt0 ? 1.f : 2.f);
        EXPECT_EQ(z[1], fgNearAt1 ? 5.f : 4.f);
        EXPECT_EQ(z[2], 3.f);
        EXPECT_EQ(z[3], 2.f);
    }
    // Without the switch the foreground lies over everywhere and Z is the background's.
    Ref<Image> dst = Output(DepthRGBAFlt32, win);
    ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dst.Get(), TagsOf(Controls{})));
    EXPECT_TRUE(Near4(dst->GetFlt(1, 0), Reference(Controls{}, D(fp), D(bp))));
    EXPECT_EQ(dst->AuxRow(AuxChannelKind::Z, 0)[1], 4.f);
}

TEST(MergeImages, PreCalculationGetsTheCanvasOnly) {
    const ImgRectI win(0, 0, 8, 8);
    Ref<Image> fg = Filled(DepthRGBAFlt32, win, FgAt, {0, 0, 0, 0});
    Ref<Image> bg = Filled(DepthRGBAFlt32, win, BgAt, {0.2f, 0.2f, 0.2f, 1});
    Ref<Image> dst =
        NewImageTagList({{ImgWidth, 16}, {ImgHeight, 12}, {ImgDepth, 8}, {ImgDataWindow, &win}, {ImgNoData, 1}});
    ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dst.Get(), TagsOf(Controls{})));
    EXPECT_FALSE(dst->HasScanLineData());
    EXPECT_EQ(dst->GetCanvasColor(), (FltPixel{0.2f, 0.2f, 0.2f, 1}));
    EXPECT_FALSE(MergeImagesTagList(nullptr, bg.Get(), dst.Get(), {}));
}

TEST(MergeImages, AnAbortStopsTheRows) {
    const ImgRectI win(0, 0, 16, 12);
    Ref<Image> fg = Filled(DepthRGBAFlt32, win, FgAt), bg = Filled(DepthRGBAFlt32, win, BgAt);
    Ref<Image> dst = Output(DepthRGBAFlt32, win);
    std::atomic<bool> abort{true};
    dst->SetAbortFlag(&abort);
    EXPECT_FALSE(MergeImagesTagList(fg.Get(), bg.Get(), dst.Get(), TagsOf(Controls{})));
}

} // namespace
} // namespace Orvane::mergetest
