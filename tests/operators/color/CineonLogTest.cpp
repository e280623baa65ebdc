// Cineon Log: both directions against the printing-density formula written here, the round trip with and without soft
// clip, a white level at or below black failing.
#include <gtest/gtest.h>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

using CineonLog = ColorTool;

struct Levels {
    double black, white, gamma, softClip;
};

void Apply(Operator *op, const Levels &l, bool toLog) {
    Test::SetNumbers(op, {{"Mode", toLog},
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
            if (toLog)
                out[c] = (p[c] >= 0 ? l.white + std::log10(p[c] * (1 - o) + o) / d : l.black + p[c] / slope) / 1023;
            else
                out[c] =
                    code >= l.black ? (std::pow(10.0, (code - l.white) * d) - o) / (1 - o) : (code - l.black) * slope;
        }
        return out;
    };
}

TEST_F(CineonLog, BothDirectionsFollowTheFormulaAtEveryDepthAndTheFrameHolds) {
    std::vector<Setting> settings;
    for (const Levels &l : {Levels{95, 685, 0.6, 0}, Levels{0, 1023, 1.0, 0}, Levels{64, 940, 0.45, 0}})
        for (bool toLog : {false, true})
            settings.push_back({[=](Operator *op) { Apply(op, l, toLog); }, Model(l, toLog)});
    ExpectFrame("CineonLog", settings, 1e-12);
}

TEST_F(CineonLog, LogToLinearAndBackWithAndWithoutSoftClipAndBadLevelsFail) {
    Ref<Image> src = Orvane::Test::PatternImage(64, 16, DepthRGBAFlt32, 12);
    for (double softClip : {0.0, 60.0}) {
        Rig rig("CineonLog", src);
        Apply(rig.tool, {95, 685, 0.6, softClip}, false);
        Operator *back = rig.Then("CineonLog");
        Apply(back, {95, 685, 0.6, softClip}, true);
        Ref<Image> linear = Render(rig.tool), again = Render(back);
        ASSERT_TRUE(linear && again);
        // Soft clip keeps every value at or below 1; far above its knee it flattens too much to come back from float.
        for (int y = 0; y < 16; ++y)
            for (int x = 0; x < 64; ++x)
                for (int c = 0; c < 3; ++c) {
                    const double v = Unit(*src, x, y, c);
                    ASSERT_LE(Unit(*linear, x, y, c), softClip > 0 ? 1.0 : HUGE_VAL);
                    if (softClip == 0 || v * 1023 < 685 + 60) {
                        ASSERT_NEAR(Unit(*again, x, y, c), v, 2e-5) << softClip;
                    }
                }
    }
    for (const char *white : {"95", "40"}) {
        Rig rig("CineonLog", src);
        rig.tool->SetName("Log1");
        Apply(rig.tool, {95, std::stod(white), 0.6, 0}, false);
        EXPECT_FALSE(Render(rig.tool));
        EXPECT_EQ(Orvane::Test::ConsoleText(rig.doc),
                  "error: Log1: the white level (" + std::string(white) + ") must lie above the black level (95)\n");
    }
}

} // namespace
} // namespace Orvane::colortest
