#include "tests/operators/color/ColorTestSupport.h"

namespace Orvane::colortest::whitebalance {

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
    Ref<Image> out = chain.Run();
    ASSERT_TRUE(out);
    EXPECT_LT(out->GetFlt(0, 0).G, std::min(out->GetFlt(0, 0).R, out->GetFlt(0, 0).B) - 0.01);
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

TEST_F(WhiteBalance, NeutralSettingsHandTheInputOnAndWhitesItCannotScaleFail) {
    Ref<Image> src = T::PatternImage(8, 4, DepthRGBAFlt16);
    Chain chain(src, "WhiteBalance");
    const Numbers neutral[] = {
        {},
        Picked({0.3, 0.3, 0.3, 1}, 1),
        {{"Method", 1}, {"Temperature", 3000}, {"Tint", 4}, {"TargetTemperature", 3000}, {"TargetTint", 4}}};
    for (const Numbers &values : neutral) {
        T::SetNumbers(chain.last, values);
        EXPECT_EQ(chain.Run().Get(), src.Get());
    }
    // A picked colour without red; 1667 K, whose white has no blue in Rec. 709 RGB: one line each.
    const std::pair<Numbers, const char *> bad[] = {
        {Picked({0, 0.5, 0.5, 1}, 0), ": the neutral color"},
        {{{"Method", 1}, {"Space", 0}, {"Temperature", 1667}}, ": the temperature's white"}};
    for (size_t i = 0; i < std::size(bad); ++i) {
        T::SetNumbers(chain.last, bad[i].first);
        EXPECT_EQ(chain.Run(), nullptr);
        const auto lines = chain.doc.ConsoleLines();
        ASSERT_EQ(lines.size(), i + 1);
        EXPECT_EQ(lines[i].text.rfind(chain.last->Name() + bad[i].second, 0), 0u) << lines[i].text;
    }
}

} // namespace Orvane::colortest::whitebalance
