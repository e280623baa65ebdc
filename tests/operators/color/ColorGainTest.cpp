// ColorGain against a double-precision model of its formulas, on every depth; the ranges' weights as a partition;
// the frame rules; neutral settings and a bad range.
#include <cmath>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tests/operators/color/GainTestSupport.h"

namespace Orvane::colorgaintest {
namespace {
using gaintest::Px;

/// One step's settings: index 0..3 red, green, blue, alpha, 4 the master (saturation: 3 is the master).
struct Step {
    double gain[5] = {1, 1, 1, 1, 1}, lift[5] = {0, 0, 0, 0, 0}, gamma[5] = {1, 1, 1, 1, 1}, sat[4] = {1, 1, 1, 1};
};
/// The whole image, then shadows, midtones, highlights.
struct Settings {
    Step step[4];
    double shadowsEnd = 0.5, highlightsStart = 0.5;
};

void Apply(Operator *op, const Settings &s) {
    const char *steps[] = {"", "Shadows", "Midtones", "Highlights"};
    const char *chans[] = {"Red", "Green", "Blue", "Alpha", ""};
    for (int r = 0; r < 4; ++r)
        for (int c = 0; c < 5; ++c) {
            const std::string pre = std::string(steps[r]) + chans[c];
            Orvane::Test::SetNumber(op, (pre + "Gain").c_str(), s.step[r].gain[c]);
            Orvane::Test::SetNumber(op, (pre + "Lift").c_str(), s.step[r].lift[c]);
            Orvane::Test::SetNumber(op, (pre + "Gamma").c_str(), s.step[r].gamma[c]);
            if (c != 3) Orvane::Test::SetNumber(op, (pre + "Saturation").c_str(), s.step[r].sat[c == 4 ? 3 : c]);
        }
    Orvane::Test::SetNumbers(op, {{"ShadowsEnd", s.shadowsEnd}, {"HighlightsStart", s.highlightsStart}});
}

double Luminance(const Px &p) { return 0.2126 * p[0] + 0.7152 * p[1] + 0.0722 * p[2]; }

Px ModelStep(const Step &s, Px p) {
    for (int c = 0; c < 4; ++c) {
        p[c] = p[c] * s.gain[c] * s.gain[4] + s.lift[c] + s.lift[4];
        const double gamma = s.gamma[c] * s.gamma[4];
        if (std::fabs(gamma - 1) >= 1.1920929e-07) {
            const double e = gamma < 1e-5 ? 1e5 : 1 / gamma;
            p[c] = std::copysign(std::pow(std::fabs(p[c]), e), p[c]);
        }
    }
    const double y = Luminance(p);
    for (int c = 0; c < 3; ++c) p[c] = y + s.sat[c] * s.sat[3] * (p[c] - y);
    return p;
}

double Smooth(double t) {
    t = std::clamp(t, 0.0, 1.0);
    return t * t * (3 - 2 * t);
}

/// Weights of shadows, midtones, highlights at luminance y.
std::array<double, 3> Weights(const Settings &s, double y) {
    const double sh = 1 - (s.shadowsEnd > 0 ? Smooth(y / s.shadowsEnd) : y > 0);
    const double hi = s.highlightsStart < 1 ? Smooth((y - s.highlightsStart) / (1 - s.highlightsStart)) : y >= 1;
    return {sh, 1 - sh - hi, hi};
}

Px Model(const Settings &s, const Px &in) {
    const Px p = ModelStep(s.step[0], in);
    const auto w = Weights(s, Luminance(p));
    Px out{};
    for (int r = 0; r < 3; ++r) {
        const Px q = ModelStep(s.step[r + 1], p);
        for (int c = 0; c < 4; ++c) out[c] += w[r] * q[c];
    }
    return out;
}

/// Named settings that cover the matrix route and the rows.
std::vector<std::pair<const char *, Settings>> Cases() {
    std::vector<std::pair<const char *, Settings>> cases;
    Settings s;
    s.step[0].gain[4] = 1.3, s.step[0].lift[4] = 0.05, s.step[0].gain[3] = 0.8;
    cases.emplace_back("master gain, lift, alpha gain (matrix)", s);
    s = {};
    s.step[0].gain[0] = 1.2, s.step[0].gain[2] = 0.8, s.step[0].sat[3] = 0.6, s.step[0].sat[1] = 1.5;
    s.step[0].lift[1] = -0.03;
    cases.emplace_back("per-channel gain and saturation (matrix)", s);
    s = {};
    s.step[0].gamma[4] = 1.4, s.step[0].gamma[0] = 0.7, s.step[0].gamma[3] = 2.0, s.step[0].lift[2] = 0.1;
    cases.emplace_back("gamma per channel", s);
    s = {};
    s.step[1].lift[4] = 0.1, s.step[3].gain[4] = 0.7, s.shadowsEnd = 0.3, s.highlightsStart = 0.6;
    cases.emplace_back("shadows lift, highlights gain", s);
    s = {};
    s.step[0].gain[4] = 1.1, s.step[2].gamma[4] = 1.8, s.step[2].sat[3] = 0.5, s.step[2].gain[1] = 1.2;
    cases.emplace_back("midtones gamma and saturation", s);
    s = {};
    s.step[0].gamma[1] = 0.5, s.step[0].sat[3] = 1.3, s.step[1].gamma[2] = 1.5, s.step[3].lift[0] = -0.05;
    s.step[3].sat[3] = 0, s.shadowsEnd = 0, s.highlightsStart = 1;
    cases.emplace_back("everything, ranges of no width", s);
    return cases;
}

class ColorGain : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

TEST_F(ColorGain, MatchesTheModelOnEveryDepth) {
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32, DepthAInt16}) {
        Ref<Image> src = Orvane::Test::PatternImage(37, 11, depth, 7);
        gaintest::Rig rig("ColorGain", src);
        const PixelFormat f = FormatOfDepth(depth);
        const double top = f.isFloat ? 1 : depth == DepthRGBAInt8 || depth == DepthAInt8 ? 255 : 65535;
        for (const auto &[name, s] : Cases()) {
            SCOPED_TRACE(std::string(name) + ", depth " + std::to_string(depth));
            Apply(rig.tool, s);
            Ref<Image> out = gaintest::Render(rig.tool);
            ASSERT_TRUE(out && out.Get() != src.Get());
            for (int y = 0; y < 11; ++y)
                for (int x = 0; x < 37; ++x) {
                    Px in = gaintest::ToPx(src->GetFlt(x, y));
                    if (src->IsMask()) in = {in[3], in[3], in[3], in[3]}; // a mask is its alpha in every channel
                    const Px want = Model(s, in), got = gaintest::ToPx(out->GetFlt(x, y));
                    for (int c = src->IsMask() ? 3 : 0; c < 4; ++c) {
                        if (f.isFloat) {
                            const double tol = depth == DepthRGBAFlt32 || depth == DepthAFlt32 ? 2e-5 : 1.5e-3;
                            ASSERT_NEAR(got[c], want[c], tol * std::max(1.0, std::fabs(want[c])))
                                << x << "," << y << " channel " << c;
                        } else { // the nearest stored value, within float rounding of the half-way points
                            ASSERT_NEAR(got[c] * top, std::clamp(want[c], 0.0, 1.0) * top, 0.52)
                                << x << "," << y << " channel " << c;
                        }
                    }
                }
        }
    }
}

TEST_F(ColorGain, RangesWithTheSameSettingsAreTheWholeImageAndTheWeightsAPartition) {
    // The three weights sum to one wherever the boundaries lie, so one setting in every range is that setting
    // applied to the whole image.
    Ref<Image> src = Orvane::Test::PatternImage(64, 16, DepthRGBAFlt32, 4);
    gaintest::Rig ranges("ColorGain", src), whole("ColorGain", src);
    for (const auto &[end, start] : {std::pair{0.5, 0.5}, {0.2, 0.7}, {0.0, 1.0}, {0.4, 0.4}}) {
        Settings s, w;
        s.shadowsEnd = end, s.highlightsStart = start;
        for (int r = 1; r < 4; ++r) s.step[r].gain[4] = 1.25, s.step[r].gamma[2] = 1.6, s.step[r].sat[3] = 0.4;
        w.step[0] = s.step[1];
        Apply(ranges.tool, s);
        Apply(whole.tool, w);
        Ref<Image> a = gaintest::Render(ranges.tool), b = gaintest::Render(whole.tool);
        ASSERT_TRUE(a && b);
        for (int y = 0; y < 16; ++y)
            for (int x = 0; x < 64; ++x)
                for (int c = 0; c < 4; ++c)
                    ASSERT_NEAR(gaintest::ToPx(a->GetFlt(x, y))[c], gaintest::ToPx(b->GetFlt(x, y))[c], 1e-5)
                        << end << "/" << start << " at " << x << "," << y;
    }
}

TEST_F(ColorGain, FrameRulesOnTheMatrixAndTheRows) {
    for (const auto &[name, s] : Cases()) {
        SCOPED_TRACE(name);
        gaintest::ExpectFrameRules(
            "ColorGain", [&s = s](Operator *op) { Apply(op, s); },
            [&s = s](const Image &, const Px &p) { return Model(s, p); }, 2e-5);
    }
}

TEST_F(ColorGain, NeutralSettingsHandTheInputOnAndABadRangeFails) {
    Ref<Image> src = Orvane::Test::PatternImage(8, 4, DepthRGBAInt16);
    gaintest::Rig rig("ColorGain", src);
    Settings tiny; // changes below the neutral test
    tiny.step[0].gain[4] = 1 + 5e-8, tiny.step[2].lift[1] = 1e-8, tiny.shadowsEnd = 0.1;
    for (const Settings &s : {Settings{}, tiny}) {
        Apply(rig.tool, s);
        EXPECT_EQ(gaintest::Render(rig.tool).Get(), src.Get());
    }
    Settings bad;
    bad.shadowsEnd = 0.6, bad.highlightsStart = 0.4;
    Apply(rig.tool, bad);
    EXPECT_EQ(gaintest::Render(rig.tool), nullptr);
    const auto lines = rig.doc.ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].text.rfind(rig.tool->Name() + ": Shadows End", 0), 0u) << lines[0].text;
}

} // namespace
} // namespace Orvane::colorgaintest
