#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using CineonLog = ColorTool;
static Setter Levels(double black, double white, double gamma, double softClip, bool toLog) {
    return Numbers(
        {{"Mode", toLog}, {"BlackLevel", black}, {"WhiteLevel", white}, {"FilmGamma", gamma}, {"SoftClip", softClip}});
}

/// Code v * 1023 to linear, no soft clip: density 0.002 a code over film gamma, black 0, white 1, tangent below black.
static PixelModel Model(double black, double white, double gamma, bool toLog) {
    return [=](const Px &p) {
        const double d = 0.002 / gamma, o = std::pow(10.0, (black - white) * d), s = std::log(10.0) * d * o / (1 - o);
        Px out = p;
        for (int c = 0; c < 3; ++c) {
            const double code = p[c] * 1023;
            out[c] = toLog ? (p[c] >= 0 ? white + std::log10(p[c] * (1 - o) + o) / d : black + p[c] / s) / 1023
                     : code >= black ? (std::pow(10.0, (code - white) * d) - o) / (1 - o)
                                     : (code - black) * s;
        }
        return out;
    };
}

TEST_F(CineonLog, BothWaysFollowTheFormulaRoundTripWithAndWithoutSoftClipAndBadLevelsFail) {
    std::vector<Setting> settings;
    for (const auto &[black, white, gamma] : {std::tuple{95, 685, 0.6}, {0, 1023, 1.0}, {64, 940, 0.45}})
        for (bool toLog : {false, true})
            settings.push_back({Levels(black, white, gamma, 0, toLog), Model(black, white, gamma, toLog)});
    ExpectFrame("CineonLog", settings, 1e-12);
    Ref<Image> src = PatternImage(64, 16, DepthRGBAFlt32, 12);
    for (double softClip : {0.0, 60.0}) {
        const Setter toLinear = Levels(95, 685, 0.6, softClip, false), toLog = Levels(95, 685, 0.6, softClip, true);
        Ref<Image> linear = Through(src, {{"CineonLog", toLinear}}),
                   again = Through(src, {{"CineonLog", toLinear}, {"CineonLog", toLog}});
        ASSERT_TRUE(linear && again);
        // Soft clip keeps every value at or below 1; far above its knee it flattens too much to come back from float.
        for (int i = 0; i < 64 * 16 * 3; ++i) {
            const int x = i / 3 % 64, y = i / 192, c = i % 3;
            const double v = PxAt(*src, x, y)[c], lin = PxAt(*linear, x, y)[c], came = PxAt(*again, x, y)[c];
            ASSERT_TRUE(softClip == 0 || lin <= 1) << lin;
            ASSERT_TRUE((softClip > 0 && v * 1023 >= 685 + 60) || std::fabs(came - v) <= 2e-5) << v << " " << came;
        }
    }
    for (const char *white : {"95", "40"}) {
        Rig rig("CineonLog", src);
        rig.tool->SetName("Log1");
        Levels(95, std::stod(white), 0.6, 0, false)(rig.tool);
        EXPECT_FALSE(Render(rig.tool));
        EXPECT_EQ(ConsoleText(rig.doc),
                  "error: Log1: the white level (" + std::string(white) + ") must lie above the black level (95)\n");
    }
}

} // namespace Orvane::colortest
