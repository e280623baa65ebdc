// The merge's pixel formulas against docs/MERGE.md written the other way round, in double (straight colours,
// sorted channels, Porter-Duff factors); whole images at every depth, the depth merge, Dissolve's noise.
#include "host/image/MergeModes.h"

#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::mergetest {
namespace {
using namespace ::Orvane::Test;

using D4 = std::array<double, 4>;
using RGB = std::array<double, 3>;

D4 D(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }

double Screen(double x, double y) { return x + y - x * y; }
double HardLight(double b, double s) { return s <= 0.5 ? b * 2 * s : Screen(b, 2 * s - 1); }

/// B(Cb, Cs) of a separable mode, on straight colour.
double Separable(int mode, double cb, double cs) {
    switch (mode) {
    case MrgNormal: return cs;
    case MrgScreen: return Screen(cb, cs);
    case MrgMultiply: return cb * cs;
    case MrgOverlay: return HardLight(cs, cb);
    case MrgHardLight: return HardLight(cb, cs);
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
    default: return cb - cs; // Subtract
    }
}

double Lum(const RGB &c) { return 0.2126 * c[0] + 0.7152 * c[1] + 0.0722 * c[2]; }
RGB SetLum(RGB c, double l) {
    const double d = l - Lum(c);
    for (double &v : c) v += d;
    const double n = std::min({c[0], c[1], c[2]}); // clipped into range toward the luma
    l = Lum(c);
    if (n < 0 && l <= 0) return {0, 0, 0};
    if (n < 0)
        for (double &v : c) v = l + (v - l) * l / (l - n);
    return c;
}
double Sat(const RGB &c) { return std::max({c[0], c[1], c[2]}) - std::min({c[0], c[1], c[2]}); }
/// By sorting the channels: the largest gets s, the smallest 0, the middle its share.
RGB SetSat(const RGB &c, double s) {
    int idx[3] = {0, 1, 2};
    std::sort(idx, idx + 3, [&c](int a, int b) { return c[a] < c[b]; });
    RGB r{};
    const double lo = c[idx[0]], mid = c[idx[1]], hi = c[idx[2]];
    if (hi > lo) r[idx[1]] = mid == hi ? s : (mid - lo) * s / (hi - lo), r[idx[2]] = s;
    return r;
}

RGB NonSeparable(int mode, const RGB &cb, const RGB &cs) {
    switch (mode) {
    case MrgHue: return SetLum(SetSat(cs, Sat(cb)), Lum(cb));
    case MrgSaturation: return SetLum(SetSat(cb, Sat(cs)), Lum(cb));
    case MrgColor: return SetLum(cs, Lum(cb));
    default: return SetLum(cb, Lum(cs));
    }
}

struct Controls {
    int mode = MrgNormal, op = MrgOver;
    double blend = 1, additive = 0, alphaGain = 1, burnIn = 0;
    bool on[4] = {true, true, true, true};
};

TagList TagsOf(const Controls &c) {
    return TagList{{MrgApplyMode, c.mode},      {MrgOperator, c.op},   {MrgBlend, c.blend}, {MrgAdditive, c.additive},
                   {MrgAlphaGain, c.alphaGain}, {MrgBurnIn, c.burnIn}, {MrgDoRed, c.on[0]}, {MrgDoGreen, c.on[1]},
                   {MrgDoBlue, c.on[2]},        {MrgDoAlpha, c.on[3]}};
}

FltPixel F(const D4 &p) { return {float(p[0]), float(p[1]), float(p[2]), float(p[3])}; }
FltPixel Merged(const Controls &c, const D4 &f, const D4 &b) {
    return MergePixel(MergeSettings::FromTags(TagsOf(c)), F(f), F(b), 0, 0);
}

/// The merge of one pixel (not Dissolve), straight from the definitions.
D4 Reference(const Controls &c, const D4 &f, const D4 &b) {
    const double as = f[3], ab = b[3];
    const double hc = (1 - c.additive) * (1 - c.burnIn), kk = 1 - c.burnIn, fa = c.alphaGain * (1 - c.burnIn);
    D4 o{};
    if (c.mode == MrgNormal) {
        // Porter-Duff: a share X of the foreground, Y of the background.
        double x = 1, yColour = 0, yAlpha = 0;
        if (c.op == MrgIn || c.op == MrgAtop) x = ab;
        if (c.op == MrgHeldOut || c.op == MrgXOr) x = 1 - ab;
        if (c.op == MrgOver || c.op == MrgAtop || c.op == MrgXOr) yColour = 1 - hc * as, yAlpha = 1 - kk * as;
        for (int i = 0; i < 3; ++i) o[i] = x * f[i] + yColour * b[i];
        o[3] = fa * x * as + yAlpha * ab;
    } else {
        RGB cs, cb, mixed;
        for (int i = 0; i < 3; ++i) cs[i] = as != 0 ? f[i] / as : 0, cb[i] = ab != 0 ? b[i] / ab : 0;
        if (c.mode >= MrgHue && c.mode <= MrgLuminosity)
            mixed = NonSeparable(c.mode, cb, cs);
        else
            for (int i = 0; i < 3; ++i) mixed[i] = Separable(c.mode, cb[i], cs[i]);
        for (int i = 0; i < 3; ++i) o[i] = f[i] * (1 - ab) + b[i] * (1 - hc * as) + as * ab * mixed[i];
        o[3] = fa * as + (1 - kk * as) * ab;
    }
    for (int i = 0; i < 4; ++i) o[i] = c.on[i] ? b[i] + c.blend * (o[i] - b[i]) : b[i];
    return o;
}

::testing::AssertionResult Near4(const FltPixel &got, const D4 &want, double tol = 2e-6) {
    for (int i = 0; i < 4; ++i)
        if (!(std::fabs(D(got)[i] - want[i]) <= tol * std::max(1.0, std::fabs(want[i]))))
            return ::testing::AssertionFailure() << "channel " << i << ": got " << D(got)[i] << ", want " << want[i];
    return ::testing::AssertionSuccess();
}

TEST(MergeModes, EveryModeAndOperatorMatchesItsDefinitionHandComputedPixelsAndDissolve) {
    // Pairs that reach every branch: both sides of 1/2 and 1/4, dodges at 0 and 1, empty and opaque, above 1.
    const std::pair<D4, D4> pairs[] = {
        {{0.12, 0.30, 0.45, 0.6}, {0.08, 0.56, 0.32, 0.8}}, // Cs .2 .5 .75, Cb .1 .7 .4
        {{0.9, 0.1, 0.5, 1.0}, {0.2, 0.6, 1.0, 1.0}},       // opaque over opaque
        {{0.25, 0.05, 0.2, 0.5}, {0, 0, 0, 0}},             // empty background
        {{0, 0, 0, 0}, {0.3, 0.2, 0.1, 0.5}},               // empty foreground
        {{1.5, 0.2, 0.0, 1.0}, {2.0, 0.5, 0.25, 1.0}},      // above 1
        {{0.35, 0.7, 0.0, 0.7}, {0.0, 0.45, 0.9, 0.9}},     // Cs 1 (dodge), Cb 0 (dodge, burn)
        {{0.06, 0.24, 0.18, 0.3}, {0.9, 0.05, 0.5, 1.0}},   // mixed
    };
    // A part of the merge with channels kept; every control at once.
    Controls blended{.blend = 0.25, .on = {true, false, true, false}};
    Controls mixed{.blend = 0.7, .additive = 0.3, .alphaGain = 0.6, .burnIn = 0.2};
    for (Controls c : {Controls{}, blended, mixed})
        for (c.mode = 0; c.mode < MrgModeCount; ++c.mode)
            for (c.op = 0; c.op < (c.mode == MrgNormal ? MrgOperatorCount : 1) && c.mode != MrgDissolve; ++c.op)
                for (const auto &[f, b] : pairs)
                    EXPECT_TRUE(Near4(Merged(c, f, b), Reference(c, f, b)))
                        << "mode " << c.mode << " op " << c.op << " blend " << c.blend << " additive " << c.additive;
    // Pixels computed by hand.
    const D4 f{0.4, 0.2, 0.1, 0.5}, b{0.3, 0.6, 0.2, 0.75}, grey{0.5, 0.5, 0.5, 1}, warm{0.5, 0.25, 0, 1};
    const std::tuple<Controls, D4, D4, D4> cases[] = {
        // Half-transparent red over opaque blue: red 0.5, blue 1 x (1 - 0.5).
        {{}, {0.5, 0, 0, 0.5}, {0, 0, 1, 1}, {0.5, 0, 0.5, 1}},
        {{.mode = MrgScreen}, grey, warm, {0.75, 0.625, 0.5, 1}}, // 0.5 + 0.5 - 0.25
        {{.mode = MrgDifference}, {0.25, 0.75, 0, 1}, {1, 0.25, 0.5, 1}, {0.75, 0.5, 0.5, 1}},
        {{.mode = MrgAdd}, {0.75, 0, 0, 1}, {0.5, 0, 0, 1}, {1.25, 0, 0, 1}}, // no clipping on float
        // In keeps the foreground where the background has alpha.
        {{.op = MrgIn}, {0.5, 0.5, 0, 1}, {0, 0, 1, 0.5}, {0.25, 0.25, 0, 0.5}},
        // Additive 1: colour added, alpha as over; 0.25: the background held out by 0.75 x alpha.
        {{.additive = 1}, f, b, {0.7, 0.8, 0.3, 0.875}},
        {{.additive = 0.25}, f, b, {0.5875, 0.575, 0.225, 0.875}},
        // Alpha gain 0: no coverage added, the background's alpha still held out.
        {{.alphaGain = 0}, f, b, {0.55, 0.5, 0.2, 0.375}},
        // Burn in: light printed on, colours add, the alpha stays the background's.
        {{.burnIn = 1}, f, b, {0.7, 0.8, 0.3, 0.75}},
        {{.mode = MrgMultiply, .blend = 0}, f, b, b},
    };
    for (const auto &[ctl, fg, bg, want] : cases) EXPECT_TRUE(Near4(Merged(ctl, fg, bg), want)) << "mode " << ctl.mode;
    // Dissolve keeps whole pixels by the noise.
    auto noise = [](int x, int y) {
        uint32_t u = static_cast<uint32_t>(x) * 0x9E3779B1u + static_cast<uint32_t>(y) * 0x85EBCA77u;
        u = (u ^ (u >> 16)) * 0x7FEB352Du;
        u = (u ^ (u >> 15)) * 0x846CA68Bu;
        return ((u ^ (u >> 16)) >> 8) / 16777216.0;
    };
    MergeSettings s;
    s.mode = MrgDissolve;
    s.blend = 0.8f;
    const FltPixel fgPixel{0.3f, 0.15f, 0.6f, 0.75f}, bgPixel{0.1f, 0.2f, 0.3f, 1.f};
    const double p = static_cast<double>(0.8f * 0.75f);
    int kept = 0, n = 0;
    for (int y = -40; y < 40; ++y)
        for (int x = -60; x < 60; ++x, ++n) {
            ASSERT_EQ(DissolveNoise(x, y), static_cast<float>(noise(x, y)));
            const FltPixel o = MergePixel(s, fgPixel, bgPixel, x, y);
            const bool keep = noise(x, y) < p;
            kept += keep;
            ASSERT_TRUE(keep ? Near4(o, {0.4, 0.2, 0.8, 1})
                             : ::testing::AssertionResult(o == bgPixel)) // straight, opaque
                << x << "," << y;
        }
    // The share kept is the chance, within a few standard deviations; the canvas is the mean.
    EXPECT_NEAR(kept / double(n), p, 4 * std::sqrt(p * (1 - p) / n));
    EXPECT_TRUE(Near4(MergeCanvasColor(s, fgPixel, bgPixel), {0.1 + p * 0.3, 0.2, 0.3 + p * 0.5, 1}));
}

FltPixel FgAt(int x, int y) { return {0.05f * (x % 7), 0.04f * (y % 9), 0.3f, 0.25f + 0.05f * ((x + y) % 10)}; }
FltPixel BgAt(int x, int y) { return {0.9f - 0.03f * x, 0.1f + 0.02f * y, 0.5f, 0.2f + 0.06f * (x % 12)}; }

/// Whether a stored component is `want` stored at `depth`: within half a code or half step, a float's few ulps.
::testing::AssertionResult StoredNear(int depth, double got, double want) {
    if (Kind(depth) < 2) want = std::clamp(want, 0.0, 1.0);
    const double tol = Kind(depth) == 3 ? 2e-6 * std::max(1.0, std::fabs(want))
                                        : HalfCode(depth, want) + (Kind(depth) == 0 ? 1e-6 : 1e-7);
    if (std::fabs(got - want) <= tol) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "got " << got << ", want " << want << " (depth " << depth << ")";
}

TEST(MergeImages, EveryDepthCanvasWindowAndOffsetFollowTheReferenceAndDataWindowsWhatCanDiffer) {
    // The foreground, placed 2 right and 1 down, left of the background, both with canvases: the result covers
    // both, its canvas is the canvases merged, each pixel the reference stored at the background's depth.
    const ImgRectI fw(-2, 1, 4, 13), bw(4, 2, 16, 10);
    const FltPixel fc{0.1f, 0.1f, 0.0f, 0.25f}, bc{0.0f, 0.2f, 0.4f, 0.5f};
    std::vector<std::pair<int, int>> depths = {{DepthRGBAFlt32, DepthRGBAInt16}}; // foreground, background
    for (int d = 1; d <= 8; ++d) depths.push_back({d, d});
    for (auto [fd, bd] : depths)
        for (int mode : {MrgNormal, MrgScreen, MrgMultiply, MrgOverlay, MrgSoftLight, MrgColor}) {
            SCOPED_TRACE("depths " + std::to_string(fd) + ", " + std::to_string(bd) + " mode " + std::to_string(mode));
            Ref<Image> fg = Filled(16, 12, fd, FgAt, &fw, fc), bg = Filled(16, 12, bd, BgAt, &bw, bc);
            TagList tags = TagsOf({.mode = mode});
            tags.Set({MrgFgOffsetX, 2}), tags.Set({MrgFgOffsetY, -1});
            const ImgRectI out = MergeDataWindow(MergeSettings::FromTags(tags), ImgRectI(0, 0, 6, 12), fc, bw, bc);
            EXPECT_EQ(out, ImgRectI(0, 0, 16, 12));
            Ref<Image> dst = Blank(16, 12, bd, &out);
            ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dst.Get(), tags));
            EXPECT_TRUE(Near4(dst->GetCanvasColor(), Reference({.mode = mode}, D(fc), D(bc))));
            for (int y = out.y0; y < out.y1; ++y)
                for (int x = out.x0; x < out.x1; ++x) {
                    const D4 want = Reference({.mode = mode}, D(fg->GetFlt(x - 2, y + 1)), D(bg->GetFlt(x, y)));
                    for (int i = 0; i < 4; ++i) // masks hold alpha
                        ASSERT_TRUE(StoredNear(bd, Channel(dst->GetFlt(x, y), i), want[bd <= 4 ? 3 : i]))
                            << x << "," << y << " ch " << i;
                }
        }
    // Data windows follow what can differ from the canvas.
    const ImgRectI fgWin(0, 0, 6, 6), bgWin(4, 4, 10, 10), both(0, 0, 10, 10);
    const FltPixel clear{}, grey{0.5f, 0.5f, 0.5f, 1};
    const std::tuple<Controls, FltPixel, ImgRectI> cases[] = {
        {{}, clear, both},                               // over: the union
        {{.op = MrgIn}, clear, ImgRectI(4, 4, 6, 6)},    // both sides cut
        {{.op = MrgIn}, grey, fgWin},                    // the background's canvas shows
        {{.op = MrgAtop}, clear, bgWin},                 //
        {{.op = MrgHeldOut}, clear, fgWin},              //
        {{.op = MrgHeldOut, .blend = 0.5}, clear, both}, // half the background stays everywhere
    };
    for (const auto &[ctl, bgCanvas, want] : cases)
        EXPECT_EQ(MergeDataWindow(MergeSettings::FromTags(TagsOf(ctl)), fgWin, clear, bgWin, bgCanvas), want) << ctl.op;
    // What the rule cuts away really is the canvas: In over windows that do not meet leaves nothing.
    EXPECT_TRUE(MergeDataWindow(MergeSettings::FromTags(TagsOf({.op = MrgIn})), ImgRectI(0, 0, 3, 3), clear,
                                ImgRectI(5, 5, 8, 8), clear)
                    .IsNull());
    // Beyond a clear foreground the rows copy the background; padded with clear pixels over the frame, the
    // foreground makes them compute every pixel: the same bits, and the copy is the background.
    const ImgRectI fgWindow(3, 2, 9, 7), bgWindow(0, 0, 16, 12);
    auto padded = [&](int x, int y) { return fgWindow.Contains(x, y) ? FgAt(x, y) : FltPixel{}; };
    for (int depth : {DepthRGBAInt8, DepthRGBAFlt16, DepthAInt16, DepthRGBAFlt32})
        for (int mode : {MrgNormal, MrgScreen, MrgColorBurn}) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " mode " + std::to_string(mode));
            Ref<Image> fg = Filled(16, 12, DepthRGBAFlt32, FgAt, &fgWindow),
                       bg = Filled(16, 12, depth, BgAt, &bgWindow);
            Ref<Image> whole = Filled(16, 12, DepthRGBAFlt32, padded, &bgWindow);
            Ref<Image> copied = Blank(16, 12, depth, &bgWindow), computed = Blank(16, 12, depth, &bgWindow);
            ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), copied.Get(), TagsOf({.mode = mode})));
            ASSERT_TRUE(MergeImagesTagList(whole.Get(), bg.Get(), computed.Get(), TagsOf({.mode = mode})));
            EXPECT_TRUE(SameBits(*copied, *computed));
            EXPECT_TRUE(AllNear(*copied, bgWindow, 0,
                                [&](int x, int y) { return (fgWindow.Contains(x, y) ? copied : bg)->GetFlt(x, y); }));
        }
}

TEST(MergeImages, DepthMergeLetsTheNearerWinPreCalculationGetsTheCanvasAbortsStop) {
    const ImgRectI win(0, 0, 4, 1);
    auto zImage = [&](const std::vector<FltPixel> &px, const std::vector<float> &z) {
        Ref<Image> img = Filled(
            16, 12, DepthRGBAFlt32, [&](int x, int) { return px[x]; }, &win);
        img->AddAuxChannel(AuxChannelKind::Z);
        std::copy(z.begin(), z.end(), img->AuxRow(AuxChannelKind::Z, 0));
        return img;
    };
    const FltPixel fp{0.4f, 0.2f, 0.0f, 0.8f}, bp{0.0f, 0.3f, 0.6f, 0.6f};
    // x 0: the foreground nearer; 1: the background nearer; 2: a tie; 3: the foreground nearer but empty.
    Ref<Image> fg = zImage({fp, fp, fp, FltPixel{}}, {1, 5, 3, 0.5f}), bg = zImage({bp, bp, bp, bp}, {2, 4, 3, 2});
    const D4 fgOver = Reference({}, D(fp), D(bp)), bgOver{0.0 + 0.4 * 0.4, 0.3 + 0.4 * 0.2, 0.6, 0.6 + 0.4 * 0.8};
    for (int zMerge : {0, 1, 2}) { // off, smaller nearer, larger nearer
        Ref<Image> dst = Blank(16, 12, DepthRGBAFlt32, &win);
        TagList tags = TagsOf({});
        tags.Set({MrgZMerge, zMerge > 0}), tags.Set({MrgZLargerIsNearer, zMerge == 2});
        ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dst.Get(), tags));
        const float *z = dst->AuxRow(AuxChannelKind::Z, 0);
        ASSERT_NE(z, nullptr);
        // Without the switch the foreground lies over everywhere and Z is the background's.
        const bool fgWins[3] = {zMerge != 2, zMerge != 1, true};
        for (int x = 0; x < 3; ++x) {
            EXPECT_TRUE(Near4(dst->GetFlt(x, 0), fgWins[x] ? fgOver : bgOver)) << zMerge << " " << x;
            EXPECT_EQ(z[x], (fgWins[x] && zMerge ? fg : bg)->AuxRow(AuxChannelKind::Z, 0)[x]) << zMerge << " " << x;
        }
        EXPECT_TRUE(dst->GetFlt(3, 0) == bp && z[3] == 2.f) << zMerge; // an empty foreground never wins
    }
    const ImgRectI square(0, 0, 8, 8);
    const FltPixel grey{0.2f, 0.2f, 0.2f, 1};
    Ref<Image> fgImage = Filled(16, 12, DepthRGBAFlt32, FgAt, &square),
               bgImage = Filled(16, 12, DepthRGBAFlt32, BgAt, &square, grey);
    Ref<Image> shape = Blank(16, 12, DepthRGBAFlt32, &square), out = Blank(16, 12, DepthRGBAFlt32, &square);
    shape->SetNoData(true);
    ASSERT_TRUE(MergeImagesTagList(fgImage.Get(), bgImage.Get(), shape.Get(), TagsOf({})));
    EXPECT_TRUE(!shape->HasScanLineData() && shape->GetCanvasColor() == grey);
    EXPECT_FALSE(MergeImagesTagList(nullptr, bgImage.Get(), out.Get(), {}));
    std::atomic<bool> abort{true};
    out->SetAbortFlag(&abort);
    EXPECT_FALSE(MergeImagesTagList(fgImage.Get(), bgImage.Get(), out.Get(), TagsOf({})));
}

} // namespace
} // namespace Orvane::mergetest
