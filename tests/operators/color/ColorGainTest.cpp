#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/color/ColorTestSupport.h"

namespace Orvane::colortest::colorgain {

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
    const char *steps[] = {"", "Shadows", "Midtones", "Highlights"}, *chans[] = {"Red", "Green", "Blue", "Alpha", ""};
    for (int r = 0; r < 4; ++r)
        for (int c = 0; c < 5; ++c) {
            const std::string pre = std::string(steps[r]) + chans[c];
            T::SetNumbers(op, {{(pre + "Gain").c_str(), s.step[r].gain[c]},
                               {(pre + "Lift").c_str(), s.step[r].lift[c]},
                               {(pre + "Gamma").c_str(), s.step[r].gamma[c]}});
            if (c != 3) T::SetNumber(op, (pre + "Saturation").c_str(), s.step[r].sat[c == 4 ? 3 : c]);
        }
    T::SetNumbers(op, {{"ShadowsEnd", s.shadowsEnd}, {"HighlightsStart", s.highlightsStart}});
}

Px ModelStep(const Step &s, Px p) {
    for (int c = 0; c < 4; ++c) {
        const bool color = c < 3; // the master leaves alpha alone
        p[c] = p[c] * s.gain[c] * (color ? s.gain[4] : 1) + s.lift[c] + (color ? s.lift[4] : 0);
        const double gamma = s.gamma[c] * (color ? s.gamma[4] : 1);
        if (std::fabs(gamma - 1) >= 1.1920929e-07)
            p[c] = std::copysign(std::pow(std::fabs(p[c]), gamma < 1e-5 ? 1e5 : 1 / gamma), p[c]);
    }
    const double y = Luminance(p);
    for (int c = 0; c < 3; ++c) p[c] = y + s.sat[c] * s.sat[3] * (p[c] - y);
    return p;
}

double Smooth(double t) {
    t = std::clamp(t, 0.0, 1.0);
    return t * t * (3 - 2 * t);
}

Px Model(const Settings &s, const Px &in) {
    const Px p = ModelStep(s.step[0], in);
    const double y = Luminance(p);
    const double sh = 1 - (s.shadowsEnd > 0 ? Smooth(y / s.shadowsEnd) : y > 0);
    const double hi = s.highlightsStart < 1 ? Smooth((y - s.highlightsStart) / (1 - s.highlightsStart)) : y >= 1;
    const double w[3] = {sh, 1 - sh - hi, hi}; // shadows, midtones, highlights
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
    auto add = [&](const char *name, auto set) { cases.emplace_back(name, Settings{}), set(cases.back().second); };
    add("master gain, lift, alpha gain (matrix)",
        [](Settings &s) { s.step[0].gain[4] = 1.3, s.step[0].lift[4] = 0.05, s.step[0].gain[3] = 0.8; });
    add("per-channel gain and saturation (matrix)", [](Settings &s) {
        s.step[0].gain[0] = 1.2, s.step[0].gain[2] = 0.8, s.step[0].sat[3] = 0.6, s.step[0].sat[1] = 1.5;
    });
    add("gamma per channel", [](Settings &s) {
        s.step[0].gamma[4] = 1.4, s.step[0].gamma[0] = 0.7, s.step[0].gamma[3] = 2.0, s.step[0].lift[2] = 0.1;
    });
    add("shadows lift, highlights gain", [](Settings &s) {
        s.step[1].lift[4] = 0.1, s.step[3].gain[4] = 0.7, s.shadowsEnd = 0.3, s.highlightsStart = 0.6;
    });
    add("midtones gamma and saturation", [](Settings &s) {
        s.step[0].gain[4] = 1.1, s.step[2].gamma[4] = 1.8, s.step[2].sat[3] = 0.5, s.step[2].gain[1] = 1.2;
    });
    add("everything, ranges of no width", [](Settings &s) {
        s.step[0].gamma[1] = 0.5, s.step[0].sat[3] = 1.3, s.step[1].gamma[2] = 1.5, s.step[3].lift[0] = -0.05;
        s.step[3].sat[3] = 0, s.shadowsEnd = 0, s.highlightsStart = 1;
    });
    add("the same in every range", [](Settings &s) {
        for (int r = 1; r < 4; ++r) s.step[r].gain[4] = 1.25, s.step[r].gamma[2] = 1.6, s.step[r].sat[3] = 0.4;
        s.shadowsEnd = 0.2, s.highlightsStart = 0.7;
    });
    return cases;
}

class ColorGain : public ToolTest {};

TEST_F(ColorGain, MatchesTheModelOnEveryDepthAndKeepsTheFrameRules) {
    for (const auto &[name, s] : Cases()) {
        SCOPED_TRACE(name);
        auto set = [&s = s](Operator *op) { Apply(op, s); };
        auto model = [&s = s](const Image &, const Px &p) { return Model(s, p); };
        ExpectFrameRules("ColorGain", set, model, 2e-6, kEveryDepth);
    }
}

TEST_F(ColorGain, NeutralSettingsHandTheInputOnAndABadRangeFails) {
    Ref<Image> src = T::PatternImage(8, 4, DepthRGBAInt16);
    Chain chain(src, "ColorGain");
    // Changes below the neutral test hand the input on; shadows ending above the start of highlights fail.
    EXPECT_EQ(chain.Run().Get(), src.Get());
    T::SetNumbers(chain.last, {{"Gain", 1 + 5e-8}, {"MidtonesGreenLift", 1e-8}, {"ShadowsEnd", 0.1}});
    EXPECT_EQ(chain.Run().Get(), src.Get());
    T::SetNumbers(chain.last, {{"ShadowsEnd", 0.6}, {"HighlightsStart", 0.4}});
    EXPECT_EQ(chain.Run(), nullptr);
    const auto lines = chain.doc.ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].text.rfind(chain.last->Name() + ": Shadows End", 0), 0u) << lines[0].text;
}

TEST_F(ColorGain, TheWholeImageStepAgreesWithOiiotool) {
    if (!T::HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    // Gain, lift, gamma and saturation as oiiotool's multiply, add, power and saturate, on values that the lift keeps
    // above 0 (its power of a negative value is not a number).
    Ref<Image> src = T::PatternImage(33, 17, DepthRGBAFlt32, 3);
    Ref<Image> theirs = ThroughOiiotool(
        *src, dir.path, "--mulc 1.32,0.99,1.1 --addc 0.35,0.35,0.35 --powc 1.25,0.625,0.8 --saturate 0.7 -d float");
    ASSERT_TRUE(theirs);
    Chain chain(src, "ColorGain");
    T::SetNumbers(chain.last, {{"Gain", 1.1}, {"RedGain", 1.2}, {"GreenGain", 0.9}, {"Lift", 0.35}});
    T::SetNumbers(chain.last, {{"Gamma", 1.25}, {"RedGamma", 0.64}, {"GreenGamma", 1.28}, {"Saturation", 0.7}});
    Ref<Image> ours = chain.Run();
    ASSERT_TRUE(ours);
    EXPECT_LT(WorstDifference(*ours, *theirs, ours->DataWindow()), 2e-6);
}

TEST_F(ColorGain, TheDeviceMatchesTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    // The device's powf against the rows' powers; integers are the rows' tables in double against float.
    const std::pair<int, double> depths[] = {
        {DepthRGBAFlt32, 2e-5}, {DepthRGBAFlt16, 1e-3}, {DepthRGBAInt16, 1.01 / 65535}, {DepthRGBAInt8, 1.01 / 255}};
    const ImgRectI window(-3, 5, 50, 38), roi(12, 2, 61, 33);
    for (const auto &[name, s] : Cases())
        for (const auto &[depth, tol] : depths) {
            SCOPED_TRACE(std::string(name) + ", depth " + std::to_string(depth));
            Chain chain(T::WindowedImage(64, 40, window, {0.2f, -0.1f, 0.6f, 0.5f}, 5, depth), "ColorGain");
            Apply(chain.last, s);
            const int launches = ctx->LaunchCount();
            RenderTask task;
            Ref<Image> cpu = chain.Run(&roi), dev = chain.Run(&roi, 0, ctx, &task);
            ASSERT_TRUE(cpu && dev && dev->DataWindow() == cpu->DataWindow());
            EXPECT_GT(ctx->LaunchCount(), launches) << "the device ran";
            EXPECT_TRUE(task.DeviceLog().empty()) << task.DeviceLog().front();
            EXPECT_EQ(dev->GetCanvasColor(), cpu->GetCanvasColor());
            EXPECT_LE(WorstDifference(*dev, *cpu, cpu->DataWindow(), 4, true), tol);
        }
}

} // namespace Orvane::colortest::colorgain
