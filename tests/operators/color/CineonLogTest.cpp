// Cineon Log: both directions against the printing-density formula written here, over several level settings and
// every depth; the round trip with and without soft clip; a white level at or below black fails.
#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class CineonLog : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

struct Levels {
    double black = 95, white = 685, gamma = 0.6, softClip = 0;
};

void Apply(Operator *op, const Levels &l, bool toLog) {
    Orvane::Test::SetNumbers(op, {{"Mode", toLog},
                                  {"BlackLevel", l.black},
                                  {"WhiteLevel", l.white},
                                  {"FilmGamma", l.gamma},
                                  {"SoftClip", l.softClip}});
}

/// Code (v * 1023) to linear: density 0.002 per code over the film gamma, black at 0 and white at 1; below black the
/// straight line with the curve's slope there. No soft clip.
PixelModel Model(const Levels &l, bool toLog) {
    return [l, toLog](const Px &p) {
        const double d = 0.002 / l.gamma, o = std::pow(10.0, (l.black - l.white) * d);
        const double slope = std::log(10.0) * d * o / (1 - o);
        Px out = p;
        for (int c = 0; c < 3; ++c) {
            const double code = p[c] * 1023;
            if (!toLog)
                out[c] =
                    code >= l.black ? (std::pow(10.0, (code - l.white) * d) - o) / (1 - o) : (code - l.black) * slope;
            else
                out[c] = (p[c] >= 0 ? l.white + std::log10(p[c] * (1 - o) + o) / d : l.black + p[c] / slope) / 1023;
        }
        return out;
    };
}

TEST_F(CineonLog, BothDirectionsFollowTheFormulaAtEveryDepthAndTheFrameHolds) {
    for (const Levels &levels :
         {Levels{}, Levels{.black = 0, .white = 1023, .gamma = 1.0}, Levels{.black = 64, .white = 940, .gamma = 0.45}})
        for (bool toLog : {false, true})
            ExpectFrame(
                "CineonLog", [&](Operator *op) { Apply(op, levels, toLog); }, Model(levels, toLog), 1e-12);
}

TEST_F(CineonLog, LogToLinearAndBackWithAndWithoutSoftClip) {
    // Log to linear and back: the codes come back; with soft clip no value passes 1 (far up it rounds to 1 in float).
    for (double softClip : {0.0, 60.0}) {
        Ref<Image> src = Orvane::Test::PatternImage(64, 16, DepthRGBAFlt32, 12);
        Rig rig("CineonLog", src);
        Apply(rig.tool, {.softClip = softClip}, false);
        Operator *back = rig.Then("CineonLog");
        Apply(back, {.softClip = softClip}, true);
        Ref<Image> linear = Render(rig.tool), again = Render(back);
        ASSERT_TRUE(linear && again);
        for (int y = 0; y < 16; ++y)
            for (int x = 0; x < 64; ++x)
                for (int c = 0; c < 3; ++c) {
                    const double v = Unit(*src, x, y, c);
                    if (softClip > 0) {
                        ASSERT_LE(Unit(*linear, x, y, c), 1.0);
                    }
                    // Far above the knee the soft clip flattens the curve too much to come back from float.
                    if (softClip == 0 || v * 1023 < 685 + 60) {
                        ASSERT_NEAR(Unit(*again, x, y, c), v, 2e-5) << softClip;
                    }
                }
    }
}

TEST_F(CineonLog, AWhiteLevelAtOrBelowBlackFailsWithOneLine) {
    for (const char *white : {"95", "40"}) {
        Rig rig("CineonLog", Orvane::Test::PatternImage(8, 4));
        rig.tool->SetName("Log1");
        Apply(rig.tool, {.white = std::stod(white)}, false);
        EXPECT_FALSE(Render(rig.tool));
        EXPECT_EQ(Orvane::Test::ConsoleText(rig.doc),
                  "error: Log1: the white level (" + std::string(white) + ") must lie above the black level (95)\n");
    }
}

} // namespace
} // namespace Orvane::colortest
