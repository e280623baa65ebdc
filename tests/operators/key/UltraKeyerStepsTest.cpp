// The keyer's pixel steps against models worked out here in double from the keying formulas, the 16-bit forms
// against the same models within their fixed-point rounding, picking, and the kernels against the rows.
#include "operators/key/UltraKeyerSteps.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/key/KeyModels.h"

namespace Orvane::ultrakeyersteptest {
namespace {
using namespace ::Orvane::Test;
using Px = std::array<double, 4>;

/// A setting of the soft matte, with the shares of the separation each round takes, as the keyer documents them.
struct SoftCase {
    const char *what;
    double bg[3], w1, w2, correction, separation;
    bool sub;
    std::vector<double> shares;
    UltraKeyerSettings Settings() const {
        UltraKeyerSettings s;
        for (int i = 0; i < 3; ++i) s.background[i] = bg[i];
        s.weight1 = w1, s.weight2 = w2, s.backgroundCorrection = correction, s.matteSeparation = separation;
        s.subtractBackground = sub;
        return s;
    }
};

const SoftCase kSoftCases[] = {
    {"green screen", {0.15, 0.75, 0.2}, 0.5, 0.5, 0, 0, true, {}},
    {"blue screen, corrected, separation 1.5", {0.1, 0.2, 0.8}, 0.3, 0.7, 0.1, 0.375, true, {1, 0.5}},
    {"red screen, full separation, colour kept", {0.8, 0.3, 0.2}, 0.6, 0.4, 0, 1, false, {1, 1, 1, 1}},
    {"green screen, a little separation", {0.2, 0.7, 0.3}, 0.5, 0.5, 0.05, 0.1, true, {0.4}},
    {"grey screen: no colour difference", {0.5, 0.5, 0.5}, 0.5, 0.5, 0, 0.5, true, {1, 1}},
};

double Clamp01(double x) { return std::min(std::max(x, 0.0), 1.0); }

/// The soft matte of colour p under k, in RGB order throughout (the key channel and the two weighted ones picked by
/// index).
Px SoftModel(const SoftCase &k, const Px &p) {
    const double *bg = k.bg;
    const int key = bg[2] >= bg[0] && bg[2] >= bg[1] ? 2 : bg[1] >= bg[0] ? 1 : 0;
    const int first = key == 0 ? 1 : 0, second = key == 2 ? 1 : 2; // red: G, B; green: R, B; blue: R, G
    const double satr = 5 * k.correction, sat = satr + 1, y = 0.299 * p[0] + 0.587 * p[1] + 0.114 * p[2];
    double c[3];
    for (int i = 0; i < 3; ++i) c[i] = sat * p[i] - satr * y;
    const double div = bg[key] - (k.w1 * bg[first] + k.w2 * bg[second]);
    const bool flat = std::fabs(div) < 1e-7;
    auto rawOf = [&] { return flat ? 0.0 : (c[key] - (k.w1 * c[first] + k.w2 * c[second])) / div; };
    double raw = rawOf(), a = 1 - Clamp01(raw);
    for (double t : flat ? std::vector<double>{} : k.shares) {
        const double mix = a * t + 1 - t;
        for (int i = 0; i < 3; ++i) c[i] = mix * c[i] + (1 - mix) * bg[i];
        raw = rawOf(), a = 1 - Clamp01(raw);
    }
    if (!k.sub) return {p[0], p[1], p[2], a};
    const double m = raw / sat, keep = Clamp01(1 - m * ((4 * k.separation + 1) * sat - 1));
    Px out{0, 0, 0, a};
    for (int i = 0; i < 3; ++i) {
        out[i] = (p[i] - std::min(std::max(bg[i] * m, 0.0), p[i])) * keep;
        out[3] = std::max(out[3], out[i]);
    }
    out[3] = Clamp01(out[3]);
    return out;
}

Px At(const Image &img, int x, int y) {
    const FltPixel p = img.GetFlt(x, y);
    return {p.R, p.G, p.B, p.A};
}

/// A plate of screen colour mixed with other colours by varying amounts (so mattes run through every level), with
/// some colours beyond 0..1, over `dw`, canvas (0.3, 0.6, 0.2, 1) beyond.
Ref<Image> Plate(const double bg[3], int depth, const ImgRectI &dw, unsigned seed = 7) {
    Ref<Image> noise = PatternImage(dw.Width(), dw.Height(), DepthRGBAFlt32, seed);
    return Filled(
        48, 32, depth,
        [&](int x, int y) {
            const FltPixel q = noise->GetFlt(x - dw.x0, y - dw.y0);
            const float f = Clamp01((q.A + 0.25f) / 1.75f);
            return FltPixel{static_cast<float>(bg[0] * (1 - f) + q.R * f),
                            static_cast<float>(bg[1] * (1 - f) + q.G * f),
                            static_cast<float>(bg[2] * (1 - f) + q.B * f), 1.f};
        },
        &dw, FltPixel{0.3f, 0.6f, 0.2f, 1.f});
}

TEST(UltraKeyerValues, DerivedValuesAndTheirFixedPointForms) {
    const struct {
        double bg[3], w1, w2, correction, separation;
        bool sub;
        int key;
        double div, sat, passes, subSub, subMul;
    } cases[] = {
        {{0.5, 0.5, 0.5}, 0.5, 0.5, 0, 0, true, 0, 0, 1, 0, 1, 0},                  // all equal: blue, no difference
        {{0.1, 0.8, 0.2}, 0.5, 0.5, 0, 0, true, 1, 0.65, 1, 0, 1, 0},               // green
        {{0.2, 0.3, 0.9}, 0.3, 0.7, 0.2, 0.375, true, 0, 0.63, 2, 2, 0.5, 4},       // blue, sat 2, separation 1.5
        {{0.9, 0.2, 0.1}, 0.5, 0.5, 0, 1, false, 2, 0.75, 1, 4, 0, 4},              // red, colour kept
        {{0.3, 0.7, 0.7}, 1, 0, 0, 0.25, true, 0, 0.4, 1, 1, 1, 1},                 // blue and green tie: blue
        {{0.7, 0.7, 0.3}, 0.5, 0.5, 0.1, 0.05, true, 1, 0.2, 1.5, 1, 1 / 1.5, 0.8}, // green and red tie: green
    };
    for (const auto &c : cases) {
        UltraKeyerSettings s;
        for (int i = 0; i < 3; ++i) s.background[i] = c.bg[i];
        s.weight1 = c.w1, s.weight2 = c.w2, s.backgroundCorrection = c.correction, s.matteSeparation = c.separation;
        s.subtractBackground = c.sub;
        const UltraKeyerValues v = DeriveUltraKeyerValues(s);
        SCOPED_TRACE(::testing::Message() << c.bg[0] << "," << c.bg[1] << "," << c.bg[2]);
        EXPECT_EQ(v.vlColor, c.key);
        EXPECT_NEAR(v.bgDiv, c.div, 1e-6);
        EXPECT_NEAR(v.sat, c.sat, 1e-6);
        EXPECT_NEAR(v.satr, c.sat - 1, 1e-6);
        EXPECT_EQ(v.passes, c.passes);
        EXPECT_NEAR(v.correction, 4 * c.separation, 1e-6);
        EXPECT_EQ(v.sub, c.sub);
        EXPECT_NEAR(v.subSub, c.subSub, 1e-6);
        EXPECT_NEAR(v.subMul, c.subMul, 1e-6);
        for (int i = 0; i < 3; ++i) EXPECT_EQ(v.bg16[i], static_cast<int>(c.bg[i] * 65535)) << i; // truncated
        EXPECT_NEAR(v.bgDiv16, c.div * 65535, 0.5);
        EXPECT_NEAR(v.sat1024, c.sat * 1024, 0.5);
        EXPECT_NEAR(v.subSub16, c.subSub * 65536, 0.5);
        EXPECT_NEAR(v.subMul16, c.subMul * 65536, 0.5);
        double left = 4 * c.separation; // the rounds' shares: whole ones, then the rest
        for (int r = 0; r < v.passes; ++r, left -= 1) EXPECT_NEAR(v.roundT16[r], std::min(left, 1.0) * 65535, 0.5) << r;
    }
}

TEST(UltraKeyerSoft, FloatAndFixedPointAgainstTheModel) {
    const ImgRectI dw(-3, 2, 41, 30); // past the left edge, short of the others
    const struct {
        int depth;
        double tol;
    } depths[] = {
        {DepthRGBAFlt32, 2e-5}, {DepthRGBAFlt16, 2e-5}, {DepthRGBAInt16, 6e-4}, {DepthRGBAInt8, 0.5 / 255 + 6e-4}};
    for (const SoftCase &k : kSoftCases)
        for (const auto &d : depths) {
            const int depth = d.depth;
            const double tol = d.tol;
            SCOPED_TRACE(std::string(k.what) + ", depth " + std::to_string(depth));
            Ref<Image> src = Plate(k.bg, depth, dw);
            const ImgRectI out(-2, 0, 44, 32); // reaches the canvas on three sides
            Ref<Image> dst = Blank(48, 32, depth, &out);
            ASSERT_TRUE(DoSoftUltraKeyer(nullptr, src.Get(), dst.Get(), DeriveUltraKeyerValues(k.Settings()), false));
            // Float16 stores the result to its precision; the model's error is relative there.
            auto near = [&](double got, double want) {
                return std::fabs(got - want) <= tol + 2 * HalfCode(depth, want) * (Kind(depth) == 2);
            };
            for (int y = out.y0; y < out.y1; ++y)
                for (int x = out.x0; x < out.x1; ++x) {
                    const Px want = SoftModel(k, At(*src, x, y)), got = At(*dst, x, y);
                    for (int c = 0; c < 4; ++c)
                        ASSERT_PRED2(near, got[c], Kind(depth) < 2 ? Clamp01(want[c]) : want[c])
                            << x << "," << y << " channel " << c;
                    const Px p = At(*src, x, y); // a grey screen is solid and keeps the colour (not below 0)
                    for (int c = 0; c < 4 && std::string(k.what).starts_with("grey"); ++c)
                        ASSERT_PRED2(near, got[c], c == 3 ? 1.0 : std::max(p[c], 0.0)) << x << "," << y;
                }
            const Px canvas = SoftModel(k, At(*src, -100, -100));
            for (int c = 0; c < 4; ++c) EXPECT_PRED2(near, At(*dst, -100, -100)[c], canvas[c]) << "canvas " << c;
        }
}

TEST(UltraKeyerPreMatte, InclusiveBoxOnFourAxesInFloatAndSixteenBits) {
    // Black has the axes (0.5, 0.5, 0.5, 0) exactly; a limit on it is inside, one step past it outside.
    const float above = std::nextafter(0.5f, 1.f), below = std::nextafter(0.5f, 0.f);
    const struct {
        float low[4], high[4];
        float alpha, alpha16; // 16 bits round the limits to codes first
    } black[] = {
        {{0.5f, 0.5f, 0.5f, 0.f}, {0.5f, 0.5f, 0.5f, 0.f}, 0.f, 0.f},
        {{above, 0.f, 0.f, 0.f}, {1.f, 1.f, 1.f, 1.f}, 1.f, 0.f},
        {{0.f, 0.f, 0.f, 0.f}, {1.f, below, 1.f, 1.f}, 1.f, 1.f},
        {{0.f, 0.f, 0.f, 1e-6f}, {1.f, 1.f, 1.f, 1.f}, 1.f, 0.f},
        {{0.f, 0.f, 0.f, 1e-4f}, {1.f, 1.f, 1.f, 1.f}, 1.f, 1.f},
    };
    for (int depth : {DepthRGBAFlt32, DepthRGBAInt16})
        for (const auto &c : black) {
            PreMatteRanges r;
            std::copy(c.low, c.low + 4, r.low), std::copy(c.high, c.high + 4, r.high);
            Ref<Image> src = Filled(4, 4, depth, Constant({0, 0, 0, 1})), dst = Blank(4, 4, depth);
            ASSERT_TRUE(DoUltraKeyer(nullptr, src.Get(), dst.Get(), r, false));
            EXPECT_EQ(dst->GetFlt(1, 2).A, depth == DepthRGBAInt16 ? c.alpha16 : c.alpha)
                << depth << " " << c.low[0] << " " << c.high[1] << " " << c.low[3];
        }
    // A box about the screen colour's axes (0.31, 0.65, 0.41, 0.51) against the model, away from its limits (16-bit
    // axes lie within a few steps of the float ones).
    const ChromaKeyRanges box = keytest::Ranges(0, {0.25f, 0.55f, 0.31f, 0.2f}, {0.45f, 0.78f, 0.52f, 0.8f}, 0);
    PreMatteRanges r;
    std::copy(box.low, box.low + 4, r.low), std::copy(box.high, box.high + 4, r.high);
    const double bg[3] = {0.2, 0.7, 0.3};
    for (int depth : {DepthRGBAFlt32, DepthRGBAInt16, DepthRGBAInt8}) {
        Ref<Image> src = Plate(bg, depth, ImgRectI(0, 0, 48, 32), 11), dst = Blank(48, 32, depth);
        ASSERT_TRUE(DoUltraKeyer(nullptr, src.Get(), dst.Get(), r, false));
        int inside = 0;
        for (int y = 0; y < 32; ++y)
            for (int x = 0; x < 48; ++x) {
                const Px p = At(*src, x, y), got = At(*dst, x, y);
                const double want = keytest::ChromaModel(box, {p[0], p[1], p[2]});
                inside += want == 0.0;
                const bool clear =
                    keytest::ChromaEdgeDistance(box, {p[0], p[1], p[2]}) > (Kind(depth) < 2 ? 1e-4 : 1e-6);
                ASSERT_TRUE(!clear || got[3] == want) << depth << " at " << x << "," << y;
                ASSERT_EQ(Px({got[0], got[1], got[2], 0}), Px({p[0], p[1], p[2], 0})); // the colour is the source's
            }
        EXPECT_GT(inside, 40) << "the box takes in part of the plate";
        EXPECT_LT(inside, 48 * 32 - 40);
    }
}

TEST(UltraKeyerCombineSubtract, CutMatteKeepOldAndRestoreColour) {
    // Combine: the matte times the work image's alpha, whose window is smaller (its canvas alpha 0.5 beyond).
    for (int depth : {DepthRGBAFlt32, DepthRGBAInt16}) {
        const ImgRectI dw(0, 0, 16, 8), ww(4, 2, 12, 6);
        Ref<Image> dst = PatternAt(16, 8, depth, 2, &dw, {0, 0, 0, 0.8f}),
                   work = PatternAt(16, 8, depth, 5, &ww, {0, 0, 0, 0.5f});
        Ref<Image> dst0 = CopyOfImage(dst.Get()), work0 = CopyOfImage(work.Get());
        ASSERT_TRUE(DoCombine(nullptr, work.Get(), dst.Get(), false));
        const double tol = depth == DepthRGBAFlt32 ? 1e-7 : 0.5 / 65535 + 1e-9;
        for (int y = 0; y < 8; ++y)
            for (int x = 0; x < 16; ++x) {
                const Px d = At(*dst0, x, y), w = At(*work0, x, y);
                const double want = depth == DepthRGBAFlt32 ? d[3] * w[3] : Clamp01(d[3]) * Clamp01(w[3]);
                ASSERT_NEAR(At(*dst, x, y)[3], want, tol) << x << "," << y;
                ASSERT_EQ(Px({d[0], d[1], d[2]}), Px({At(*dst, x, y)[0], At(*dst, x, y)[1], At(*dst, x, y)[2]}));
                if (ww.Contains(x, y)) {
                    ASSERT_EQ(At(*work, x, y)[3], d[3]) << "the old matte kept";
                }
            }
        EXPECT_EQ(work->GetCanvasColor().A, 0.8f);
        EXPECT_NEAR(dst->GetCanvasColor().A, 0.4, 1e-5);
    }
    // Subtract, per component: colour c with old matte a0, new matte a1, source s.
    const struct {
        double c, s, a0, a1, want;
    } cases[] = {
        {0.2, 0.6, 0.5, 0.75, 0.4}, // grown halfway to solid: halfway to the source
        {0.2, 0.6, 0.0, 1.0, 0.6},  // grown to solid: the source
        {0.5, 0.3, 0.2, 0.6, 0.3},  // restoring toward a darker source stops at it
        {0.4, 0.9, 0.8, 0.4, 0.2},  // shrunk by half: halved
        {0.4, 0.9, 0.6, 0.6, 0.4},  // unchanged matte: unchanged colour
        {0.4, 0.9, 0.6, 0.0, 0.0},  // cut out: no colour
        {0.3, 0.7, 1.0, 1.0, 0.3},  // solid stays
    };
    for (int depth : {DepthRGBAFlt32, DepthRGBAInt16, DepthRGBAInt8})
        for (const auto &c : cases) {
            const float fc = static_cast<float>(c.c), fs = static_cast<float>(c.s);
            Ref<Image> dst = Filled(2, 2, depth, Constant({fc, fc, fc, static_cast<float>(c.a1)}));
            Ref<Image> old = Filled(2, 2, depth, Constant({0, 0, 0, static_cast<float>(c.a0)}));
            Ref<Image> src = Filled(2, 2, depth, Constant({fs, fs, fs, 1}));
            const float matte = dst->GetFlt(1, 1).A;
            ASSERT_TRUE(DoSubtract(nullptr, src.Get(), dst.Get(), old.Get(), false));
            const double tol = depth == DepthRGBAFlt32 ? 1e-6 : depth == DepthRGBAInt16 ? 2.0 / 65535 : 1.5 / 255;
            EXPECT_NEAR(dst->GetFlt(1, 1).G, c.want, tol) << depth << ": " << c.c << " " << c.a0 << "->" << c.a1;
            EXPECT_EQ(dst->GetFlt(1, 1).A, matte);
        }
}

TEST(UltraKeyerDevice, KernelsGiveTheRowsResults) {
    ORVANE_NEED_OPENCL(ctx);
    const SoftCase &k = kSoftCases[1];
    const UltraKeyerValues v = DeriveUltraKeyerValues(k.Settings());
    PreMatteRanges r;
    const float low[4] = {0.2f, 0.3f, 0.5f, 0.1f}, high[4] = {0.55f, 0.7f, 0.95f, 0.7f};
    std::copy(low, low + 4, r.low), std::copy(high, high + 4, r.high);
    const ImgRectI sw(-3, 2, 41, 30), dw(-2, 0, 44, 32);
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8}) {
        SCOPED_TRACE("depth " + std::to_string(depth));
        Ref<Image> src = Plate(k.bg, depth, sw);
        // Each step on both paths: the point steps into fresh images, the in-place ones on copies.
        Ref<Image> soft[2], pre[2], old[2];
        for (int dev = 0; dev < 2; ++dev) {
            DeviceRender render(dev ? ctx : nullptr);
            const int launches = ctx->LaunchCount();
            soft[dev] = Blank(48, 32, depth, &dw), pre[dev] = Blank(48, 32, depth, &dw);
            ASSERT_TRUE(DoSoftUltraKeyer(&render.req, src.Get(), soft[dev].Get(), v, dev));
            ASSERT_TRUE(DoUltraKeyer(&render.req, src.Get(), pre[dev].Get(), r, dev));
            ASSERT_TRUE(DoCombine(&render.req, pre[dev].Get(), soft[dev].Get(), dev));
            old[dev] = CopyOfImage(pre[dev].Get()); // downloads: the work image holds the soft matte
            ASSERT_TRUE(DoSubtract(&render.req, src.Get(), pre[dev].Get(), old[dev].Get(), dev));
            EXPECT_EQ(ctx->LaunchCount(), launches + (dev ? 4 : 0));
            EXPECT_TRUE(render.task.DeviceLog().empty()) << render.task.DeviceLog().front();
            ASSERT_TRUE(soft[dev]->DownloadGPUMem() && pre[dev]->DownloadGPUMem());
        }
        EXPECT_EQ(soft[1]->GetCanvasColor(), soft[0]->GetCanvasColor());
        EXPECT_EQ(pre[1]->GetCanvasColor(), pre[0]->GetCanvasColor());
        if (FormatOfDepth(depth).isFloat) {
            EXPECT_TRUE(SameBits(*soft[1], *soft[0]));
            EXPECT_TRUE(SameBits(*pre[1], *pre[0]));
        } else { // the kernels work in float, the rows in fixed point, whose errors grow by 1 / bgDiv, sat and subMul
            const double tol = depth == DepthRGBAInt8 ? 1.5 / 255 : 32.0 / 65535;
            EXPECT_LE(MaxDiff(*soft[1], *soft[0], dw), tol);
            EXPECT_LE(MaxDiff(*pre[1], *pre[0], dw), tol);
        }
    }
}

} // namespace
} // namespace Orvane::ultrakeyersteptest
