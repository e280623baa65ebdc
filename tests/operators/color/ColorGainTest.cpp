#include <limits>

#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/color/ColorTestSupport.h"

namespace Orvane::colortest::gain {

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

class WhiteBalance : public ToolTest {};

Numbers Picked(const Px &n, double space) {
    return {{"Method", 0}, {"Space", space}, {"NeutralRed", n[0]}, {"NeutralGreen", n[1]}, {"NeutralBlue", n[2]}};
}

/// Linear Rec. 709 RGB of the white at CIE xy (luminance 1), by the published XYZ to RGB matrix.
Rgb WhiteOf(double x, double y) {
    const double X = x / y, Z = (1 - x - y) / y;
    return {3.2404542 * X - 1.5371385 - 0.4985314 * Z, -0.9692660 * X + 1.8760108 + 0.0415560 * Z,
            0.0556434 * X - 0.2040259 + 1.0572252 * Z};
}

TEST_F(WhiteBalance, APickedColourBecomesTheGreyOfItsLuminanceAndTheFrameRulesHold) {
    const Px picked[] = {{0.8, 0.5, 0.3, 1}, {0.2, 0.25, 0.6, 1}, {1.4, 1.1, 0.9, 1}, {0.05, 0.5, 0.05, 1}};
    for (double space : {0.0, 1.0})
        for (const Px &n : picked) {
            SCOPED_TRACE(std::to_string(n[0]) + "," + std::to_string(n[1]) + (space ? " cones" : " RGB"));
            // Premultiplied by 0.4: the same grey times alpha, alpha kept.
            Chain chain(ColourRow({{0.4 * n[0], 0.4 * n[1], 0.4 * n[2]}}, 0.4f), "WhiteBalance");
            T::SetNumbers(chain.last, Picked(n, space));
            Ref<Image> out = chain.Run();
            const double y = 0.4 * Luminance(n);
            ExpectColoursNear(out, {{y, y, y}}, 2e-6);
            EXPECT_EQ(out->GetFlt(0, 0).A, 0.4f);
        }
    // In RGB, a scale of each channel on every depth.
    const Px n{0.6, 0.45, 0.3, 1};
    auto set = [&](Operator *op) { T::SetNumbers(op, Picked(n, 0)); };
    auto model = [&](const Image &, const Px &p) {
        const double y = Luminance(n);
        return Px{p[0] * y / n[0], p[1] * y / n[1], p[2] * y / n[2], p[3]};
    };
    ExpectFrameRules("WhiteBalance", set, model, 2e-6, kEveryDepth);
}

TEST_F(WhiteBalance, TemperatureWhitesMatchPublishedChromaticities) {
    // Planckian whites: 2856 K (CIE illuminant A), 5000 K and 6500 K. The white of one temperature becomes the white
    // of the target, to the accuracy of the locus approximation, in either space.
    const double whites[][3] = {{2856, 0.44757, 0.40745}, {5000, 0.3451, 0.3516}, {6500, 0.3135, 0.3236}};
    for (const auto &from : whites)
        for (const auto &to : whites)
            for (double space : {0.0, 1.0}) {
                SCOPED_TRACE(std::to_string(from[0]) + " K to " + std::to_string(to[0]) + " K " +
                             (space ? "cones" : "RGB"));
                Chain chain(ColourRow({WhiteOf(from[1], from[2])}), "WhiteBalance");
                T::SetNumbers(
                    chain.last,
                    {{"Method", 1}, {"Space", space}, {"Temperature", from[0]}, {"TargetTemperature", to[0]}});
                ExpectColoursNear(chain.Run(), {WhiteOf(to[1], to[2])}, 0.01);
            }
    // Tint: a source white said to be greener is corrected by taking green away.
    Chain chain(ColourRow({{1, 1, 1}}), "WhiteBalance");
    T::SetNumbers(chain.last, {{"Method", 1}, {"Tint", 10}});
    const Ref<Image> out = chain.Run();
    ASSERT_TRUE(out && out->GetFlt(0, 0).G < std::min(out->GetFlt(0, 0).R, out->GetFlt(0, 0).B) - 0.01);
}

TEST_F(WhiteBalance, ForwardThenReverseGivesTheInputBack) {
    const Numbers cases[] = {Picked({0.7, 0.5, 0.2, 1}, 0),
                             Picked({0.3, 0.6, 0.9, 1}, 1),
                             {{"Method", 1}, {"Temperature", 3200}, {"Tint", -7}, {"TargetTemperature", 7500}}};
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16})
        for (const Numbers &values : cases) {
            SCOPED_TRACE("depth " + std::to_string(depth) + ", Method " + std::to_string(values[0].second));
            Ref<Image> src = T::PatternImage(40, 9, depth, 11);
            Chain chain(src);
            chain.Add("WhiteBalance", {}, values);
            T::SetNumber(chain.Add("WhiteBalance", {}, values), "Direction", 1);
            Ref<Image> out = chain.Run();
            ASSERT_TRUE(out);
            EXPECT_LE(WorstDifference(*out, *src, src->DataWindow(), 4, true), depth == DepthRGBAFlt32 ? 1e-5 : 4e-3);
        }
}

TEST_F(WhiteBalance, NeutralSettingsOfBothToolsHandTheInputOnAndBadOnesFailWithOneLine) {
    const std::tuple<const char *, Numbers, const char *> cases[] = {
        {"ColorGain", {}, nullptr},
        {"ColorGain",
         {{"Gain", 1 + 5e-8}, {"MidtonesGreenLift", 1e-8}, {"ShadowsEnd", 0.1}},
         nullptr}, // below the test
        {"ColorGain", {{"ShadowsEnd", 0.6}, {"HighlightsStart", 0.4}}, ": Shadows End"},
        {"WhiteBalance", {}, nullptr},
        {"WhiteBalance", Picked({0.3, 0.3, 0.3, 1}, 1), nullptr},
        {"WhiteBalance",
         {{"Method", 1}, {"Temperature", 3000}, {"Tint", 4}, {"TargetTemperature", 3000}, {"TargetTint", 4}},
         nullptr},
        {"WhiteBalance", Picked({0, 0.5, 0.5, 1}, 0), ": the neutral color"},                                 // no red
        {"WhiteBalance", {{"Method", 1}, {"Space", 0}, {"Temperature", 1667}}, ": the temperature's white"}}; // no blue
    for (const auto &[cls, values, line] : cases) {
        Ref<Image> src = T::PatternImage(8, 4, DepthRGBAFlt16);
        Chain chain(src);
        chain.Add(cls, {}, values);
        Ref<Image> out = chain.Run();
        const auto lines = chain.doc.ConsoleLines();
        if (!line)
            EXPECT_TRUE(out.Get() == src.Get() && lines.empty()) << cls;
        else
            EXPECT_TRUE(!out && lines.size() == 1 && lines[0].text.rfind(chain.last->Name() + line, 0) == 0) << cls;
    }
}

class AutoGain : public ToolTest {};

struct Stretch {
    double low = 0, high = 1;
    bool separate = false;
};

Numbers Values(const Stretch &s) { return {{"Low", s.low}, {"High", s.high}, {"Channels", double(s.separate)}}; }

/// The expected stretch of `p`, from the finite values of `src`'s data window: red, green and blue (a mask: its
/// one channel, read as alpha) from their lowest and highest, together or each on its own, to Low and High.
Px StretchModel(const Stretch &s, const Image &src, Px p) {
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
    for (const Stretch &s : {Stretch{0.1, 0.8, false}, {0.1, 0.8, true}, {1, 0, false}, {-0.2, 1.3, true}}) {
        SCOPED_TRACE(std::to_string(s.low) + ".." + std::to_string(s.high) + (s.separate ? " separate" : ""));
        auto set = [&](Operator *op) { T::SetNumbers(op, Values(s)); };
        auto model = [&](const Image &src, const Px &p) { return StretchModel(s, src, p); };
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
    for (int x = 0; x < 16; ++x)
        EXPECT_NEAR(out->GetFlt(x, 0).G, StretchModel({}, *odd, ToPx(odd->GetFlt(x, 0)))[1], 1e-6);
    // Nothing to stretch: a flat image, a flat channel alone, or a range that is already Low to High.
    Ref<Image> flat = NewImageTagList({{ImgWidth, 6}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt16}});
    flat->Fill(FltPixel{0.3f, 0.3f, 0.3f, 1.f});
    Ref<Image> ramp = ColourRow({{0, 0, 0}, {1, 1, 1}});
    for (const auto &[img, separate] : {std::pair{flat, false}, {flat, true}, {ramp, false}, {ramp, true}}) {
        Chain c(img);
        c.Add("AutoGain", {}, Values({0, 1, separate}));
        EXPECT_EQ(c.Run().Get(), img.Get());
    }
}

} // namespace Orvane::colortest::gain
