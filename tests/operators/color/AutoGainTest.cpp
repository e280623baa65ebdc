#include <limits>

#include "tests/operators/color/ColorTestSupport.h"

namespace Orvane::colortest::autogain {

class AutoGain : public ToolTest {};

struct Settings {
    double low = 0, high = 1;
    bool separate = false;
};

void Apply(Operator *op, const Settings &s) {
    T::SetNumbers(op, {{"Low", s.low}, {"High", s.high}, {"Channels", s.separate ? 1.0 : 0.0}});
}

/// The expected stretch of `p`, from the finite values of `src`'s data window: red, green and blue (a mask: its
/// one channel, read as alpha) from their lowest and highest, together or each on its own, to Low and High.
Px Model(const Settings &s, const Image &src, Px p) {
    const int first = src.IsMask() ? 3 : 0, last = src.IsMask() ? 4 : 3;
    double lo[4] = {INFINITY, INFINITY, INFINITY, INFINITY}, hi[4] = {-INFINITY, -INFINITY, -INFINITY, -INFINITY};
    const ImgRectI dw = src.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x)
            for (int c = first; c < last; ++c) {
                const double v = ToPx(src.GetFlt(x, y))[c];
                const int k = s.separate ? c : first;
                if (std::isfinite(v)) lo[k] = std::min(lo[k], v), hi[k] = std::max(hi[k], v);
            }
    for (int c = first; c < last; ++c) {
        const int k = s.separate ? c : first;
        if (hi[k] - lo[k] > 1.1920929e-07) p[c] = s.low + (p[c] - lo[k]) * (s.high - s.low) / (hi[k] - lo[k]);
    }
    return p;
}

TEST_F(AutoGain, MatchesTheStretchOfItsOwnMeasurementOnEveryDepthAndKeepsTheFrameRules) {
    for (const Settings &s : {Settings{0.1, 0.8, false}, {0.1, 0.8, true}, {1, 0, false}, {-0.2, 1.3, true}}) {
        SCOPED_TRACE(std::to_string(s.low) + ".." + std::to_string(s.high) + (s.separate ? " separate" : ""));
        auto set = [&](Operator *op) { Apply(op, s); };
        auto model = [&](const Image &src, const Px &p) { return Model(s, src, p); };
        ExpectFrameRules("AutoGain", set, model, 2e-6, kEveryDepth);
    }
}

TEST_F(AutoGain, SkipsValuesThatAreNotFiniteAndHandsFlatImagesOn) {
    const float nan = std::numeric_limits<float>::quiet_NaN(), inf = std::numeric_limits<float>::infinity();
    Ref<Image> odd = T::PatternImage(16, 4, DepthRGBAFlt32, 2);
    odd->PutFlt(3, 1, {nan, inf, -inf, 1});
    odd->PutFlt(7, 2, {40, 0.5f, 0.5f, 1}); // one bright pixel sets the top for every channel together
    Chain chain(odd, "AutoGain");
    Ref<Image> out = chain.Run();
    ASSERT_TRUE(out);
    EXPECT_NEAR(out->GetFlt(7, 2).R, 1.0, 1e-6);
    EXPECT_TRUE(std::isnan(out->GetFlt(3, 1).R));
    for (int x = 0; x < 16; ++x) EXPECT_NEAR(out->GetFlt(x, 0).G, Model({}, *odd, ToPx(odd->GetFlt(x, 0)))[1], 1e-6);
    // Nothing to stretch: a flat image, a flat channel alone, or a range that is already Low to High.
    Ref<Image> flat = NewImageTagList({{ImgWidth, 6}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt16}});
    flat->Fill(FltPixel{0.3f, 0.3f, 0.3f, 1.f});
    Ref<Image> ramp = ColourRow({{0, 0, 0}, {1, 1, 1}});
    for (const auto &[img, separate] : {std::pair{flat, false}, {flat, true}, {ramp, false}, {ramp, true}}) {
        Chain c(img, "AutoGain");
        Apply(c.last, {0, 1, separate});
        EXPECT_EQ(c.Run().Get(), img.Get());
    }
}

} // namespace Orvane::colortest::autogain
