// Cineon Log: both directions against the printing-density formula written here in double, at every depth and over
// several black/white/gamma settings; known codes; the round trip with and without soft clip; a white level at or
// below black fails with one line; the frame.
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

/// Code value (of 1023) to linear: density above black by 0.002 per code over the film gamma, black at 0 and white
/// at 1; below black the straight line with the curve's slope there. No soft clip.
PixelModel Model(const Levels &l, bool toLog) {
    return [l, toLog](const Px &p) {
        const double d = 0.002 / l.gamma, o = std::pow(10.0, (l.black - l.white) * d);
        const double slope = std::log(10.0) * d * o / (1 - o);
        Px out = p;
        for (int c = 0; c < 3; ++c) {
            if (!toLog) {
                const double code = p[c] * 1023;
                out[c] =
                    code >= l.black ? (std::pow(10.0, (code - l.white) * d) - o) / (1 - o) : (code - l.black) * slope;
            } else {
                const double code = p[c] >= 0 ? l.white + std::log10(p[c] * (1 - o) + o) / d : l.black + p[c] / slope;
                out[c] = code / 1023;
            }
        }
        return out;
    };
}

const std::pair<const char *, Levels> kLevels[] = {
    {"defaults", {}},
    {"full range, gamma 1", {.black = 0, .white = 1023, .gamma = 1.0}},
    {"video levels, gamma 0.45", {.black = 64, .white = 940, .gamma = 0.45}},
};

TEST_F(CineonLog, BothDirectionsFollowTheFormulaAtEveryDepthAndTheFrameHolds) {
    for (const auto &[name, levels] : kLevels)
        for (bool toLog : {false, true}) {
            for (int depth : kEveryDepth) {
                Ref<Image> src = Orvane::Test::PatternImage(33, 9, depth, 11);
                Rig rig("CineonLog", src);
                Apply(rig.tool, levels, toLog);
                Ref<Image> out = Render(rig.tool);
                ASSERT_TRUE(out) << name;
                const std::string what =
                    std::string(name) + (toLog ? " to log" : " to linear") + ", depth " + std::to_string(depth);
                ExpectModel(Model(levels, toLog), *src, *out, what, 1e-12);
            }
            ExpectFrame(
                "CineonLog", [&, l = levels, toLog](Operator *op) { Apply(op, l, toLog); }, Model(levels, toLog),
                1e-12);
        }
}

TEST_F(CineonLog, KnownCodesRoundTripsAndSoftClip) {
    // Black and white codes give 0 and 1; one density unit (500 codes at gamma 1) above white gives about 10.
    const Levels full{.black = 0, .white = 500, .gamma = 1.0};
    const std::tuple<const char *, Levels, float, double> codes[] = {
        {"black", {}, 95.f / 1023, 0.0},
        {"white", {}, 685.f / 1023, 1.0},
        {"one density unit above white", full, 1000.f / 1023, (10.0 - 0.1) / (1 - 0.1)},
    };
    for (const auto &[name, levels, code, linear] : codes) {
        Ref<Image> flat = NewImageTagList({{ImgWidth, 2}, {ImgHeight, 2}, {ImgDepth, DepthRGBAFlt32}});
        flat->Fill({code, code, code, 0.5f});
        Rig rig("CineonLog", flat);
        Apply(rig.tool, levels, false);
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out);
        Orvane::Test::ExpectPixelNear(out->GetFlt(1, 1), {float(linear), float(linear), float(linear), 0.5f}, 2e-6,
                                      name);
    }
    // Log to linear and back, with and without soft clip: the codes come back. With soft clip no value passes 1 (far up
    // it rounds to 1 in float).
    for (double softClip : {0.0, 60.0}) {
        Ref<Image> src = Orvane::Test::PatternImage(64, 16, DepthRGBAFlt32, 12);
        Rig rig("CineonLog", src);
        Apply(rig.tool, {.softClip = softClip}, false);
        Operator *back = rig.doc.AddTool(OvID("CineonLog"));
        ASSERT_TRUE(back->FindInput("Input")->ConnectTo(rig.tool->FindMainOutput()));
        Apply(back, {.softClip = softClip}, true);
        Ref<Image> linear = Render(rig.tool), again = Render(back);
        ASSERT_TRUE(linear && again);
        for (int y = 0; y < 16; ++y)
            for (int x = 0; x < 64; ++x)
                for (int c = 0; c < 3; ++c) {
                    const double v = Unit(*src, x, y, c);
                    if (softClip > 0) ASSERT_LE(Unit(*linear, x, y, c), 1.0) << x << "," << y;
                    // Far above the knee the soft clip flattens the curve too much to come back from float.
                    if (softClip > 0 && v * 1023 > 685 + 60) continue;
                    ASSERT_NEAR(Unit(*again, x, y, c), v, 2e-5) << softClip << " at " << x << "," << y;
                }
    }
}

TEST_F(CineonLog, AWhiteLevelAtOrBelowBlackFailsWithOneLine) {
    for (double white : {95.0, 40.0}) {
        Rig rig("CineonLog", Orvane::Test::PatternImage(8, 4));
        rig.tool->SetName("Log1");
        Apply(rig.tool, {.white = white}, false);
        EXPECT_FALSE(Render(rig.tool));
        char line[128];
        std::snprintf(line, sizeof line, "error: Log1: the white level (%g) must lie above the black level (95)\n",
                      white);
        EXPECT_EQ(Orvane::Test::ConsoleText(rig.doc), line);
    }
}

} // namespace
} // namespace Orvane::colortest
