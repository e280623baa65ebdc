// The Delta Keyer's steps against a model of their arithmetic written here in
// double, the records' edge cases, and the rows against the kernels.
#include <algorithm>
#include <cmath>
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/color/ColorCurvesTable.h"
#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "operators/key/DeltaKeyerSteps.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::deltakeyersteptest {
namespace {

namespace ts = Orvane::Test;
using Rgb = std::array<double, 3>;

/// A w x 1 float image holding `px`.
Ref<Image> Row(const std::vector<FltPixel> &px, const FltPixel &canvas = {}) {
    auto img = MakeRef<Image>(static_cast<int>(px.size()), 1, DepthRGBAFlt32);
    img->AllocScanLineData();
    for (size_t i = 0; i < px.size(); ++i) img->PutFlt(static_cast<int>(i), 0, px[i]);
    img->SetCanvasColor(canvas);
    return img;
}
Ref<Image> Blank(const Image &like) {
    auto img = MakeRef<Image>(like.Width(), like.Height(), DepthRGBAFlt32);
    img->SetDataWindow(like.DataWindow());
    return img;
}
FltPixel Px(const Rgb &c, double a = 1.0) {
    return {static_cast<float>(c[0]), static_cast<float>(c[1]), static_cast<float>(c[2]), static_cast<float>(a)};
}

/// The record's arithmetic in double, with the channels chosen by hand.
struct Model {
    int key, mid, low;
    double g, k1, k2, c0, offset;
    Rgb bg;
    Model(const Rgb &b, const Rgb &ref, double gain, double balance, int k, int m, int l)
        : key(k), mid(m), low(l), g(gain), bg(b) {
        k1 = ref[k] / ref[m] * balance;
        k2 = ref[k] / ref[l] * (1 - balance);
        c0 = b[k] - (k1 * b[m] + k2 * b[l]);
        offset = (b[0] + b[1] + b[2]) * (gain - 1) / 3;
    }
    void Clean(const Rgb &c) {
        bg = c;
        c0 = std::fabs(c[key] - (k1 * c[mid] + k2 * c[low]));
        offset = (c[0] + c[1] + c[2]) * (g - 1) / 3;
    }
    double Matte(const Rgb &p) const {
        const double d = offset * (1 - (k1 + k2)) + c0;
        return d == 0 ? 0 : (p[key] - (k1 * p[mid] + k2 * p[low])) * g / d;
    }
    /// The screen pass on p: colour and alpha.
    FltPixel Screen(const Rgb &p, const Model *alpha) const {
        const double m = Matte(p);
        Rgb q;
        for (int c = 0; c < 3; ++c) q[c] = p[c] - std::min(std::max((bg[c] + offset) * m, 0.0), p[c]);
        const double a = alpha ? alpha->Matte(p) * alpha->g : m * g;
        return Px(q, std::clamp(std::max({1 - a, q[0], q[1], q[2]}), 0.0, 1.0));
    }
};

DeltaKeyerScreenInfo Build(const Rgb &bg, const Rgb &ref, double gain, double balance, bool *distinct = nullptr) {
    DeltaKeyerScreenInputs in;
    for (int c = 0; c < 3; ++c) in.background[c] = float(bg[c]), in.reference[c] = float(ref[c]);
    in.gain = gain, in.balance = balance;
    DeltaKeyerScreenInfo info;
    const bool d = BuildDeltaKeyerScreenInfo(in, info);
    if (distinct) *distinct = d;
    return info;
}

TEST(DeltaKeyerSteps, TheRecordPicksTheKeyAndItsFactors) {
    const Rgb grey{0.5, 0.5, 0.5};
    struct Case {
        const char *what;
        Rgb bg, ref;
        double gain, balance;
        int key, mid, low;
        bool distinct;
    } cases[] = {
        {"green screen", {0.1, 0.8, 0.2}, grey, 1, 0.5, 1, 2, 0, true},
        {"blue screen", {0.15, 0.25, 0.9}, grey, 1, 0.5, 2, 1, 0, true},
        {"red key", {0.9, 0.3, 0.2}, grey, 1.3, 0.3, 0, 1, 2, true},
        {"grey: green, then blue mid", grey, grey, 1, 0.5, 1, 2, 0, false},
        {"green ties blue: green", {0.1, 0.7, 0.7}, grey, 1, 0.5, 1, 2, 0, true},
        {"blue ties red: blue", {0.7, 0.2, 0.7}, grey, 1, 0.5, 2, 0, 1, true},
        {"balance 1: mid only", {0.1, 0.8, 0.2}, grey, 1, 1.0, 1, 2, 0, true},
        {"balance 0: low only", {0.1, 0.8, 0.2}, grey, 1, 0.0, 1, 2, 0, true},
        {"gain 2", {0.1, 0.8, 0.2}, grey, 2, 0.5, 1, 2, 0, true},
        // The reference scales the balanced values: green's reference lifts blue above green.
        {"reference", {0.2, 0.6, 0.55}, {0.5, 0.7, 0.5}, 1, 0.5, 2, 1, 0, true},
        {"reference ratios", {0.1, 0.8, 0.2}, {0.4, 0.6, 0.3}, 1.1, 0.7, 1, 2, 0, true},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        bool distinct = false;
        const DeltaKeyerScreenInfoParams p = Build(c.bg, c.ref, c.gain, c.balance, &distinct).p;
        EXPECT_EQ(distinct, c.distinct);
        ASSERT_EQ(p.keyIndex, c.key);
        EXPECT_EQ(p.midIndex, c.mid);
        EXPECT_EQ(p.lowIndex, c.low);
        const Model m(c.bg, c.ref, c.gain, c.balance, c.key, c.mid, c.low);
        EXPECT_NEAR(p.midFactor, m.k1, 1e-6);
        EXPECT_NEAR(p.lowFactor, m.k2, 1e-6);
        EXPECT_NEAR(p.denomBase, m.c0, 1e-6);
        EXPECT_NEAR(p.offset, m.offset, 1e-6);
        EXPECT_NEAR(p.oneMinusFactors, 1 - (m.k1 + m.k2), 1e-6);
        EXPECT_NEAR(DeltaKeyerDenominator(p), m.offset * (1 - (m.k1 + m.k2)) + m.c0, 1e-6);
        if (c.balance == 1.0) {
            EXPECT_EQ(p.lowFactor, 0.f);
        }
        if (c.balance == 0.0) {
            EXPECT_EQ(p.midFactor, 0.f);
        }
        if (c.gain == 1.0) {
            EXPECT_EQ(DeltaKeyerDenominator(p), p.denomBase) << "gain 1: offset 0, d is c0";
        }
    }
    // A grey background at gain 1 cannot key: d is 0, and so is every matte.
    const DeltaKeyerScreenInfo greyInfo = Build(grey, grey, 1, 0.5);
    EXPECT_EQ(DeltaKeyerDenominator(greyInfo.p), 0.f);
    const float p[3] = {0.2f, 0.9f, 0.1f};
    EXPECT_EQ(DeltaKeyerMatteValue(greyInfo, p), 0.f);
}

TEST(DeltaKeyerSteps, TheMatteFollowsTheModelAndTheBackgroundKeysToOne) {
    const Rgb ref{0.45, 0.55, 0.5};
    const Rgb bg{0.12, 0.78, 0.25};
    const std::vector<Rgb> pixels{bg, {0.5, 0.5, 0.5}, {0.8, 0.3, 0.2}, {0.2, 0.6, 0.3}, {0, 0, 0}, {1.2, 1.4, -0.1}};
    for (double gain : {1.0, 1.4, 0.8})
        for (double balance : {0.0, 0.35, 1.0}) {
            const DeltaKeyerScreenInfo info = Build(bg, ref, gain, balance);
            const Model m(bg, ref, gain, balance, 1, 2, 0);
            for (const Rgb &p : pixels) {
                const float f[3] = {float(p[0]), float(p[1]), float(p[2])};
                EXPECT_NEAR(DeltaKeyerMatteValue(info, f), m.Matte(p), 1e-5) << gain << " " << balance;
            }
            if (gain == 1.0) {
                const float f[3] = {float(bg[0]), float(bg[1]), float(bg[2])};
                EXPECT_NEAR(DeltaKeyerMatteValue(info, f), 1.0, 1e-6) << "the background itself";
            }
        }
}

TEST(DeltaKeyerSteps, TheScreenPassMatchesTheModel) {
    const Rgb bg{0.1, 0.75, 0.3}, refA{0.5, 0.5, 0.5}, refC{0.4, 0.5, 0.6};
    const std::vector<Rgb> pixels{bg, {0.6, 0.5, 0.4}, {0.3, 0.7, 0.35}, {0.05, 0.9, 0.2}, {1.1, 0.2, 0.6}};
    std::vector<FltPixel> px;
    for (const Rgb &p : pixels) px.push_back(Px(p, 0.3));
    Ref<Image> src = Row(px, Px({0.2, 0.7, 0.3}, 1));
    // A clean plate: the background drifting across the frame, equal to the
    // source at the first pixel.
    std::vector<Rgb> plate;
    std::vector<FltPixel> cleanPx;
    for (size_t i = 0; i < pixels.size(); ++i) plate.push_back(i == 0 ? pixels[0] : Rgb{0.12, 0.7 + 0.02 * i, 0.28});
    for (const Rgb &c : plate) cleanPx.push_back(Px(c));
    Ref<Image> clean = Row(cleanPx);
    for (double gain : {1.0, 1.25})
        for (bool same : {true, false})
            for (bool withClean : {false, true}) {
                SCOPED_TRACE("gain " + std::to_string(gain) + (same ? " same" : " two records") +
                             (withClean ? " clean" : ""));
                const DeltaKeyerScreenInfo color = Build(bg, refC, gain, 0.4), alpha = Build(bg, refA, gain, 0.6);
                Ref<Image> dst = Blank(*src);
                ASSERT_TRUE(
                    ProcessScreen({}, src.Get(), dst.Get(), withClean ? clean.Get() : nullptr, color, alpha, same));
                for (size_t i = 0; i < pixels.size(); ++i) {
                    Model mc(bg, refC, gain, 0.4, 1, 2, 0), ma(bg, refA, gain, 0.6, 1, 2, 0);
                    if (withClean) mc.Clean(plate[i]), ma.Clean(plate[i]);
                    ts::ExpectPixelNear(dst->GetFlt(int(i), 0), mc.Screen(pixels[i], same ? nullptr : &ma), 2e-5,
                                        "pixel " + std::to_string(i));
                }
                if (gain == 1.0 && same && !withClean)
                    ts::ExpectPixelNear(dst->GetFlt(0, 0), {0, 0, 0, 0}, 1e-6, "the background keys to nothing");
                if (withClean && gain == 1.0) // the clean plate equals the source there: matte 1
                    ts::ExpectPixelNear(dst->GetFlt(0, 0), {0, 0, 0, 0}, 1e-6, "clean plate equal to the source");
                // The canvas goes through the same formula.
                const Model mc(bg, refC, gain, 0.4, 1, 2, 0), ma(bg, refA, gain, 0.6, 1, 2, 0);
                if (!withClean)
                    ts::ExpectPixelNear(dst->GetCanvasColor(), mc.Screen({0.2, 0.7, 0.3}, same ? nullptr : &ma), 2e-5,
                                        "canvas");
            }
}

TEST(DeltaKeyerSteps, TuningWeighsTheKeyByTheRanges) {
    const ColorCurvesTable table;
    DeltaKeyerScreenInputs in;
    in.background[0] = 0.1f, in.background[1] = 0.8f, in.background[2] = 0.2f;
    in.rangeGains[0] = 1.5, in.rangeGains[1] = 0.5, in.rangeGains[2] = 2.0;
    in.table = &table;
    DeltaKeyerScreenInfo info;
    BuildDeltaKeyerScreenInfo(in, info);
    ASSERT_TRUE(info.p.tuning);
    const Model m({0.1, 0.8, 0.2}, {0.5, 0.5, 0.5}, 1, 0.5, 1, 2, 0);
    for (float key : {0.f, 0.1f, 0.5f, 0.9f, 1.3f}) {
        const float p[3] = {0.2f, key, 0.3f};
        float ws, wm, wh;
        table.WeightsAt(key, ws, wm, wh);
        const double weighed = key * (1.5 * ws + 0.5 * wm + 2.0 * wh);
        EXPECT_NEAR(DeltaKeyerMatteValue(info, p), m.Matte({0.2, weighed, 0.3}), 1e-5) << key;
    }
    // Gains of exactly 1 leave the tuning off.
    in.rangeGains[0] = in.rangeGains[1] = in.rangeGains[2] = 1.0;
    BuildDeltaKeyerScreenInfo(in, info);
    EXPECT_FALSE(info.p.tuning);
}

/// Runs a step that writes into `img` in place and gives its pixel i.
using Step = std::function<bool(Image *)>;
FltPixel RunOn(const FltPixel &in, const Step &step) {
    Ref<Image> img = Row({in});
    EXPECT_TRUE(step(img.Get()));
    return img->GetFlt(0, 0);
}

TEST(DeltaKeyerSteps, PointStepsFollowTheirFormulas) {
    const FltPixel F{0.2f, 0.3f, 0.1f, 0.75f}, S{0.6f, 0.5f, 0.9f, 1.f};
    const float C[3] = {0.5f, 0.25f, 1.f};
    auto replace = [&](int mode, float a0, float a1) {
        Ref<Image> s = Row({S}), before = Row({{0, 0, 0, a0}}), after = Row({{0, 0, 0, a1}});
        return RunOn(F,
                     [&](Image *img) { return ProcessReplace({}, mode, s.Get(), before.Get(), after.Get(), img, C); });
    };
    const float d = 0.5f; // the rise of "alpha rising by 0.5"
    const float soft = ((0.6f - 0.2f) + (0.5f - 0.3f) + (0.9f - 0.1f)) * d / 3;
    struct Case {
        const char *what;
        FltPixel got, want;
    } cases[] = {
        {"hard colour adds half the colour",
         replace(DeltaKeyerReplaceHardColor, 0.25f, 0.75f),
         {0.2f + 0.25f, 0.3f + 0.125f, 0.1f + 0.5f, 0.75f}},
        {"source: toward the source", replace(DeltaKeyerReplaceSource, 0.5f, 1.f), {0.6f, 0.5f, 0.9f, 0.75f}},
        {"source with a1 = a0 leaves F", replace(DeltaKeyerReplaceSource, 0.4f, 0.4f), F},
        {"source from solid: no change", replace(DeltaKeyerReplaceSource, 1.f, 1.f), F},
        {"soft colour",
         replace(DeltaKeyerReplaceSoftColor, 0.2f, 0.7f),
         {0.2f + soft * 0.5f, 0.3f + soft * 0.25f, 0.1f + soft, 0.75f}},
        {"falling alpha scales", replace(DeltaKeyerReplaceHardColor, 0.8f, 0.2f), {0.05f, 0.075f, 0.025f, 0.75f}},
        {"from clear to clear: black", replace(DeltaKeyerReplaceSoftColor, 0.f, 0.f), {0, 0, 0, 0.75f}},
        {"none", replace(DeltaKeyerReplaceNone, 0.8f, 0.2f), F},
        {"threshold",
         RunOn(F, [](Image *i) { return ProcessThreshold({}, i, 0.5f, 0.9f); }),
         {0.2f, 0.3f, 0.1f, 0.625f}},
        {"threshold below",
         RunOn(F, [](Image *i) { return ProcessThreshold({}, i, 0.8f, 0.9f); }),
         {0.2f, 0.3f, 0.1f, 0}},
        {"threshold above",
         RunOn(F, [](Image *i) { return ProcessThreshold({}, i, 0.f, 0.5f); }),
         {0.2f, 0.3f, 0.1f, 1}},
        {"threshold as a step",
         RunOn(F, [](Image *i) { return ProcessThreshold({}, i, 0.7f, 0.7f); }),
         {0.2f, 0.3f, 0.1f, 1}},
        {"color max: the brightest channel",
         RunOn({0.9f, 0.2f, 0.1f, 0.3f}, [](Image *i) { return ProcessColorMax({}, nullptr, i); }),
         {0.9f, 0.2f, 0.1f, 0.9f}},
        {"color max: clamped",
         RunOn({1.4f, 0.2f, 0.1f, 0.3f}, [](Image *i) { return ProcessColorMax({}, nullptr, i); }),
         {1.4f, 0.2f, 0.1f, 1.f}},
        {"alpha to colour, inverted",
         RunOn(F, [](Image *i) { return ProcessAlphaToColor({}, i, i, true); }),
         {0.25f, 0.25f, 0.25f, 0.75f}},
        {"source alpha shown",
         RunOn(F, [](Image *i) { return ProcessSourceAlpha({}, i, i, DeltaKeyerSourceAlphaShow); }),
         {0.75f, 0.75f, 0.75f, 1}},
    };
    for (const Case &c : cases) ts::ExpectPixelNear(c.got, c.want, 1e-6, c.what);
    // Mask merge, both ways, and with the mask inverted.
    Ref<Image> mask = Row({{0.4f, 0.4f, 0.4f, 0.4f}});
    for (bool invert : {false, true})
        for (bool invertMask : {false, true}) {
            const double s = invertMask ? 0.6 : 0.4, dd = 0.75;
            const double want = invert ? (1 - dd) * (1 - s) + s : (1 - s) * dd + s;
            EXPECT_NEAR(RunOn(F, [&](Image *i) { return ProcessMaskMerge({}, mask.Get(), i, invert, invertMask); }).A,
                        want, 1e-6);
        }
    // Subtracting the source's alpha scales colour and alpha alike.
    EXPECT_NEAR(RunOn(F, [&](Image *i) { return ProcessSourceAlpha({}, mask.Get(), i, 1); }).G, 0.3 * 0.6, 1e-6);
}

TEST(DeltaKeyerSteps, PreMatteRangesAndTheirSoftEdge) {
    DeltaKeyerPreMatteRanges r;
    const float lo[4] = {0.0f, 0.5f, 0.0f, 0.2f}, hi[4] = {0.3f, 1.0f, 0.4f, 0.7f};
    std::copy(lo, lo + 4, r.low), std::copy(hi, hi + 4, r.high);
    auto pre = [&](const FltPixel &p, float soft) {
        r.soft = soft;
        Ref<Image> src = Row({p}), dst = Blank(*src);
        EXPECT_TRUE(ProcessPreMatte({}, src.Get(), dst.Get(), r));
        return dst->GetFlt(0, 0).A;
    };
    const FltPixel screen{0.1f, 0.8f, 0.2f, 1}; // Y = 0.5206
    EXPECT_EQ(pre(screen, 0), 0.f);
    EXPECT_EQ(pre(screen, 0.2f), 0.f);
    EXPECT_EQ(pre({0.3f, 0.5f, 0.4f, 1}, 0), 0.f) << "limits count as inside";
    EXPECT_EQ(pre({0.35f, 0.8f, 0.2f, 1}, 0), 1.f);
    EXPECT_NEAR(pre({0.35f, 0.8f, 0.2f, 1}, 0.2f), 0.05 / 0.2, 1e-6) << "red 0.05 above its range";
    EXPECT_NEAR(pre({0.1f, 0.8f, 0.9f, 1}, 0.2f), 1.0, 1e-6) << "blue beyond the soft range";
    // Two axes outside: the larger wins (red 0.06 above, green 0.1 below).
    EXPECT_NEAR(pre({0.36f, 0.4f, 0.2f, 1}, 0.2f), 0.5, 1e-5);
}

TEST(DeltaKeyerSteps, CombineRestoreAndStatusUseEachInput) {
    const float other[4] = {0.1f, 0.9f, 0.2f, 1};
    Ref<Image> src = Row({{0.6f, 0.4f, 0.2f, 0.5f}, {0.6f, 0.4f, 0.2f, 0.5f}});
    Ref<Image> preMatte = Row({{0, 0, 0, 0.25f}, {0, 0, 0, 1}});
    Ref<Image> clean = Row({{0.2f, 0.6f, 0.0f, 1}, {0.2f, 0.6f, 0.0f, 1}});
    for (bool withClean : {false, true}) {
        Ref<Image> dst = Blank(*src);
        ASSERT_TRUE(
            ProcessPreMatteCombine({}, src.Get(), dst.Get(), preMatte.Get(), withClean ? clean.Get() : nullptr, other));
        const double o[3] = {withClean ? 0.2 : 0.1, withClean ? 0.6 : 0.9, withClean ? 0.0 : 0.2};
        ts::ExpectPixelNear(
            dst->GetFlt(0, 0),
            {float(0.6 * 0.25 + o[0] * 0.75), float(0.4 * 0.25 + o[1] * 0.75), float(0.2 * 0.25 + o[2] * 0.75), 0.5f},
            1e-6, "mixed");
        ts::ExpectPixelNear(dst->GetFlt(1, 0), src->GetFlt(1, 0), 0, "outside the ranges: the source");
    }
    // Restore fringe: core from the eroded matte, soft alpha up to the dilated one.
    Ref<Image> img = Row({{0.3f, 0.3f, 0.3f, 0}, {0, 0, 0, 0}, {0, 0, 0, 1}});
    Ref<Image> softA = Row({{0, 0, 0, 0.4f}, {0, 0, 0, 0.4f}, {0, 0, 0, 0.4f}});
    Ref<Image> eroded = Row({{0, 0, 0, 0}, {0, 0, 0, 0}, {0, 0, 0, 1}});
    Ref<Image> dilated = Row({{0, 0, 0, 1}, {0, 0, 0, 0.1f}, {0, 0, 0, 1}});
    ASSERT_TRUE(ProcessRestoreFringe({}, softA.Get(), img.Get(), eroded.Get(), dilated.Get()));
    EXPECT_FLOAT_EQ(img->GetFlt(0, 0).A, 0.4f);
    EXPECT_FLOAT_EQ(img->GetFlt(1, 0).A, 0.1f);
    EXPECT_FLOAT_EQ(img->GetFlt(2, 0).A, 1.f);
    EXPECT_FLOAT_EQ(img->GetFlt(0, 0).R, 0.3f) << "colour kept";
    ASSERT_TRUE(ProcessRestoreFringe({}, softA.Get(), img.Get(), nullptr, nullptr));
    EXPECT_FLOAT_EQ(img->GetFlt(2, 0).A, 0.4f) << "no operands: the soft alpha";
    // Status: clear, partial, solid; then the matte stage's change, the solid and garbage tints.
    Ref<Image> st = Row({{0, 0, 0, 0}, {0, 0, 0, 0.5f}, {0, 0, 0, 1}, {0, 0, 0, 0.5f}});
    Ref<Image> before = Row({{0, 0, 0, 0}, {0, 0, 0, 0.5f}, {0, 0, 0, 1}, {0, 0, 0, 0.2f}});
    Ref<Image> diff = Blank(*st);
    ASSERT_TRUE(ProcessStatusDiff({}, before.Get(), st.Get(), diff.Get()));
    EXPECT_NEAR(diff->GetFlt(3, 0).A, 0.3, 1e-6);
    ASSERT_TRUE(ProcessStatus({}, st.Get(), diff.Get(), false));
    const FltPixel want[4] = {{0, 0, 0, 0}, {0.5f, 0.5f, 0.5f, 0.5f}, {1, 1, 1, 1}, {0.75f, 0.75f, 0.25f, 0.5f}};
    for (int x = 0; x < 4; ++x) ts::ExpectPixelNear(st->GetFlt(x, 0), want[x], 1e-6, "status " + std::to_string(x));
    Ref<Image> m = Row({{0, 0, 0, 1}, {0, 0, 0, 0}, {0, 0, 0, 1}, {0, 0, 0, 0}});
    ASSERT_TRUE(ProcessStatusSolid({}, st.Get(), m.Get(), false));
    ts::ExpectPixelNear(st->GetFlt(0, 0), {0, 0.5f, 0, 0}, 1e-6, "solid added: green");
    ts::ExpectPixelNear(st->GetFlt(2, 0), {1, 1, 1, 1}, 1e-6, "already solid: nothing added");
    ASSERT_TRUE(ProcessStatusGarbage({}, st.Get(), m.Get(), true));
    ts::ExpectPixelNear(st->GetFlt(1, 0), {0.75f, 0.25f, 0.25f, 0.5f}, 1e-6, "garbage removed: red");
}

TEST(DeltaKeyerSteps, PixelsBeyondAnInputsWindowReadItsCanvas) {
    // The source covers the middle of a wider destination; outside it the
    // threshold sees the canvas, and the canvas result fills those spans.
    const ImgRectI sw(4, 2, 12, 6), dw(0, 0, 16, 8);
    Ref<Image> src = ts::WindowedImage(16, 8, sw, {0.3f, 0.6f, 0.2f, 0.7f}, 3, DepthRGBAFlt32);
    auto dst = MakeRef<Image>(16, 8, DepthRGBAFlt32);
    dst->SetDataWindow(dw);
    ASSERT_TRUE(ProcessColorMax({}, src.Get(), dst.Get())); // dst reads as canvas 0, key is the source
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const float k = sw.Contains(x, y) ? src->GetFlt(x, y).A : 0.7f;
            ASSERT_FLOAT_EQ(dst->GetFlt(x, y).A, std::clamp(k, 0.f, 1.f)) << x << "," << y;
        }
    EXPECT_FLOAT_EQ(dst->GetCanvasColor().A, 0.7f);
}

TEST(DeltaKeyerSteps, TheKernelsGiveTheRowsValues) {
    ORVANE_NEED_OPENCL(ctx);
    const ImgRectI dw(-2, -1, 30, 18);
    auto image = [&](unsigned seed, const ImgRectI &w, int depth = DepthRGBAFlt32) {
        return ts::WindowedImage(28, 16, w, {0.15f, 0.7f, 0.25f, 0.6f}, seed, depth);
    };
    Ref<Image> src = image(1, ImgRectI(0, 0, 28, 16)), clean = image(2, ImgRectI(3, 2, 20, 14));
    Ref<Image> before = image(3, ImgRectI(-2, 0, 24, 16)), after = image(4, ImgRectI(1, -1, 30, 12));
    Ref<Image> mask = image(5, ImgRectI(5, 3, 26, 15), DepthAFlt32);
    const ColorCurvesTable table;
    DeltaKeyerScreenInputs in;
    in.background[0] = 0.12f, in.background[1] = 0.75f, in.background[2] = 0.3f;
    in.gain = 1.2;
    in.table = &table;
    DeltaKeyerScreenInfo color, alpha;
    BuildDeltaKeyerScreenInfo(in, color);
    in.reference[0] = 0.4f, in.rangeGains[1] = 1.3;
    BuildDeltaKeyerScreenInfo(in, alpha);
    DeltaKeyerPreMatteRanges ranges;
    ranges.low[1] = 0.4f, ranges.high[0] = 0.5f, ranges.soft = 0.1f;
    const float other[4] = {0.1f, 0.8f, 0.2f, 1}, C[3] = {0.3f, 0.6f, 0.9f};
    using Make = std::function<bool(const DeltaKeyerRun &, Image *)>;
    const std::vector<std::pair<std::string, Make>> steps = {
        {"screen", [&](auto &r, Image *d) { return ProcessScreen(r, src.Get(), d, nullptr, color, color, true); }},
        {"screen clean",
         [&](auto &r, Image *d) { return ProcessScreen(r, src.Get(), d, clean.Get(), color, alpha, false); }},
        {"pre-matte", [&](auto &r, Image *d) { return ProcessPreMatte(r, src.Get(), d, ranges); }},
        {"combine",
         [&](auto &r, Image *d) { return ProcessPreMatteCombine(r, src.Get(), d, mask.Get(), clean.Get(), other); }},
        {"combine plain",
         [&](auto &r, Image *d) { return ProcessPreMatteCombine(r, src.Get(), d, mask.Get(), nullptr, other); }},
        {"threshold", [&](auto &r, Image *d) { return ProcessThreshold(r, d, 0.2f, 0.8f); }},
        {"restore",
         [&](auto &r, Image *d) { return ProcessRestoreFringe(r, before.Get(), d, mask.Get(), after.Get()); }},
        {"restore alone",
         [&](auto &r, Image *d) { return ProcessRestoreFringe(r, before.Get(), d, nullptr, nullptr); }},
        {"merge", [&](auto &r, Image *d) { return ProcessMaskMerge(r, mask.Get(), d, false, true); }},
        {"merge inverted", [&](auto &r, Image *d) { return ProcessMaskMerge(r, mask.Get(), d, true, false); }},
        {"color max", [&](auto &r, Image *d) { return ProcessColorMax(r, mask.Get(), d); }},
    };
    const std::vector<std::pair<std::string, Make>> views = {
        {"screen tuned",
         [&](auto &r, Image *d) { return ProcessScreen(r, src.Get(), d, nullptr, alpha, alpha, true); }},
        {"status diff", [&](auto &r, Image *d) { return ProcessStatusDiff(r, before.Get(), after.Get(), d); }},
        {"status", [&](auto &r, Image *d) { return ProcessStatus(r, d, mask.Get(), false); }},
        {"status inverted", [&](auto &r, Image *d) { return ProcessStatus(r, d, nullptr, true); }},
        {"status solid", [&](auto &r, Image *d) { return ProcessStatusSolid(r, d, mask.Get(), false); }},
        {"status garbage", [&](auto &r, Image *d) { return ProcessStatusGarbage(r, d, mask.Get(), true); }},
        {"ranges", [&](auto &r, Image *d) { return ProcessRangesToColor(r, src.Get(), d, table); }},
        {"alpha to colour", [&](auto &r, Image *d) { return ProcessAlphaToColor(r, before.Get(), d, true); }},
        {"copy colour", [&](auto &r, Image *d) { return ProcessCopyColor(r, clean.Get(), d); }},
        {"source alpha", [&](auto &r, Image *d) { return ProcessSourceAlpha(r, mask.Get(), d, 0); }},
        {"source alpha off", [&](auto &r, Image *d) { return ProcessSourceAlpha(r, mask.Get(), d, 1); }},
    };
    std::vector<std::pair<std::string, Make>> all = steps;
    all.insert(all.end(), views.begin(), views.end());
    for (int mode = 1; mode < 4; ++mode)
        all.push_back({"replace mask " + std::to_string(mode), [&, mode](auto &r, Image *d) {
                           return ProcessReplaceMask(r, mode, src.Get(), before.Get(), mask.Get(), mode == 2, d, C);
                       }});
    for (int mode = 0; mode < 4; ++mode)
        all.push_back({"replace " + std::to_string(mode), [&, mode](auto &r, Image *d) {
                           return ProcessReplace(r, mode, src.Get(), before.Get(), after.Get(), d, C);
                       }});
    for (const auto &[name, step] : all) {
        SCOPED_TRACE(name);
        // Each step works on a copy of the same windowed image.
        Ref<Image> start = image(7, dw);
        Ref<Image> cpu = CopyOfImage(start.Get()), dev = CopyOfImage(start.Get());
        ASSERT_TRUE(step(DeltaKeyerRun{}, cpu.Get()));
        ts::DeviceRender render(ctx);
        const int launches = ctx->LaunchCount();
        ASSERT_TRUE(step(DeltaKeyerRun{&render.req, true}, dev.Get()));
        EXPECT_EQ(ctx->LaunchCount(), launches + (name == "replace 0" ? 0 : 1)) << "the device ran it (None: nothing)";
        ASSERT_TRUE(dev->DownloadGPUMem());
        ts::ExpectPixelNear(dev->GetCanvasColor(), cpu->GetCanvasColor(), 0, "canvas");
        const ImgRectI w = cpu->DataWindow();
        ASSERT_EQ(dev->DataWindow(), w);
        for (int y = w.y0; y < w.y1; ++y)
            for (int x = w.x0; x < w.x1; ++x) {
                const FltPixel a = dev->GetFlt(x, y), b = cpu->GetFlt(x, y);
                const float va[4] = {a.R, a.G, a.B, a.A}, vb[4] = {b.R, b.G, b.B, b.A};
                for (int c = 0; c < 4; ++c)
                    ASSERT_NEAR(va[c], vb[c], 2e-6 * std::max(1.f, std::fabs(vb[c]))) << x << "," << y << " " << c;
            }
    }
}

} // namespace
} // namespace Orvane::deltakeyersteptest
