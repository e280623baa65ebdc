// AutoGain against its stretch worked out from the test's own measurement of the source, on every depth; values
// that are not finite, flat images, a region that still sees the whole input, and the frame rules.
#include <algorithm>
#include <cmath>
#include <limits>
#include <string>

#include <gtest/gtest.h>

#include "tests/operators/color/GainTestSupport.h"

namespace Orvane::autogaintest {
namespace {
using gaintest::Px;
using gaintest::Render;
using gaintest::Rig;
using gaintest::ToPx;

class AutoGain : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

struct Settings {
    double low = 0, high = 1;
    bool separate = false;
};

void Apply(Operator *op, const Settings &s) {
    Orvane::Test::SetNumbers(op, {{"Low", s.low}, {"High", s.high}, {"Channels", s.separate ? 1.0 : 0.0}});
}

/// The expected stretch of `p`, from the finite values of `src`'s data window: red, green and blue (a mask: its
/// one channel, read as alpha) from their lowest and highest, together or each on its own, to Low and High.
Px Model(const Settings &s, const Image &src, Px p) {
    const int first = src.IsMask() ? 3 : 0, last = src.IsMask() ? 4 : 3;
    double lo[4], hi[4];
    std::fill(lo, lo + 4, INFINITY);
    std::fill(hi, hi + 4, -INFINITY);
    const ImgRectI dw = src.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const Px q = ToPx(src.GetFlt(x, y));
            for (int c = first; c < last; ++c)
                if (std::isfinite(q[c])) {
                    const int k = s.separate ? c : first;
                    lo[k] = std::min(lo[k], q[c]), hi[k] = std::max(hi[k], q[c]);
                }
        }
    for (int c = first; c < last; ++c) {
        const int k = s.separate ? c : first;
        if (hi[k] - lo[k] > 1.1920929e-07) p[c] = s.low + (p[c] - lo[k]) * (s.high - s.low) / (hi[k] - lo[k]);
    }
    return p;
}

TEST_F(AutoGain, MatchesTheStretchOfItsOwnMeasurementOnEveryDepthAndKeepsTheFrameRules) {
    const Settings cases[] = {{0.1, 0.8, false}, {0.1, 0.8, true}, {1, 0, false}, {-0.2, 1.3, true}};
    for (const Settings &s : cases) {
        SCOPED_TRACE(std::to_string(s.low) + ".." + std::to_string(s.high) + (s.separate ? " separate" : ""));
        auto set = [&](Operator *op) { Apply(op, s); };
        auto model = [&](const Image &src, const Px &p) { return Model(s, src, p); };
        gaintest::ExpectModelOnEveryDepth("AutoGain", set, model);
        gaintest::ExpectFrameRules("AutoGain", set, model, 2e-6);
    }
}

TEST_F(AutoGain, SkipsValuesThatAreNotFiniteAndHandsFlatImagesOn) {
    const float nan = std::numeric_limits<float>::quiet_NaN(), inf = std::numeric_limits<float>::infinity();
    Ref<Image> odd = Orvane::Test::PatternImage(16, 4, DepthRGBAFlt32, 2);
    odd->PutFlt(3, 1, {nan, inf, -inf, 1});
    odd->PutFlt(7, 2, {40, 0.5f, 0.5f, 1}); // one bright pixel sets the top for every channel together
    Rig rig("AutoGain", odd);
    const Settings s{0, 1, false};
    Apply(rig.tool, s);
    Ref<Image> out = Render(rig.tool);
    ASSERT_TRUE(out);
    EXPECT_NEAR(out->GetFlt(7, 2).R, 1.0, 1e-6);
    EXPECT_TRUE(std::isnan(out->GetFlt(3, 1).R));
    for (int x = 0; x < 16; ++x) EXPECT_NEAR(out->GetFlt(x, 0).G, Model(s, *odd, ToPx(odd->GetFlt(x, 0)))[1], 1e-6);

    // Nothing to stretch: a flat image, a flat channel alone, or a range that is already Low to High.
    Ref<Image> flat = NewImageTagList({{ImgWidth, 6}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt16}});
    flat->Fill(FltPixel{0.3f, 0.3f, 0.3f, 1.f});
    Ref<Image> ramp = NewImageTagList({{ImgWidth, 2}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    ramp->AllocScanLineData();
    ramp->PutFlt(0, 0, {0.f, 0.f, 0.f, 1.f});
    ramp->PutFlt(1, 0, {1.f, 1.f, 1.f, 1.f});
    for (const auto &[img, separate] : {std::pair{flat, false}, {flat, true}, {ramp, false}, {ramp, true}}) {
        Rig r("AutoGain", img);
        Apply(r.tool, {0, 1, separate});
        EXPECT_EQ(Render(r.tool).Get(), img.Get());
    }
}

TEST_F(AutoGain, ARegionMeasuresTheWholeInput) {
    Ref<Image> src = Orvane::Test::PatternImage(64, 40, DepthRGBAFlt32, 6);
    Rig rig("AutoGain", src);
    rig.source->cutToRegion = true; // the source gives only what it is asked for
    Apply(rig.tool, {0.05, 0.9, true});
    Ref<Image> whole = Render(rig.tool);
    const ImgRectI roi(10, 12, 20, 18);
    Ref<Image> part = Render(rig.tool, &roi);
    ASSERT_TRUE(whole && part && part->DataWindow() == roi);
    gaintest::ExpectSameBits(*part, *whole, roi);
}

} // namespace
} // namespace Orvane::autogaintest
