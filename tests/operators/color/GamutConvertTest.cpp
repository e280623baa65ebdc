#include "tests/operators/color/ColorTestSupport.h"

namespace Orvane::colortest::gamut {

enum Gamut { Rec709, Rec2020, DCIP3, DisplayP3, AP0, AP1 };
enum Curve { Linear, SRGB, Rec709Curve, Gamma, Cineon };

/// A Gamut tool's inputs.
Numbers Convert(Gamut from, Curve fromCurve, Gamut to, Curve toCurve) {
    return {{"SourceGamut", from}, {"SourceCurve", fromCurve}, {"OutputGamut", to}, {"OutputCurve", toCurve}};
}

Ref<Image> Through(const std::vector<Rgb> &colours, const std::vector<Numbers> &steps) {
    Chain chain(ColourRow(colours));
    for (const Numbers &settings : steps) chain.Add("GamutConvert", {}, settings);
    return chain.Run();
}

class GamutConvertTest : public ToolTest {};

TEST_F(GamutConvertTest, PublishedMatricesKeepTheFrameRules) {
    // BT.2087 (Rec.709 to Rec.2020, four places) and the ACES AP0 to AP1 matrix (ten places).
    const double bt2087[3][3] = {{0.6274, 0.3293, 0.0433}, {0.0691, 0.9195, 0.0114}, {0.0164, 0.0880, 0.8956}};
    const double ap0ToAp1[3][3] = {{1.4514393161, -0.2365107469, -0.2149285693},
                                   {-0.0765537734, 1.1762296998, -0.0996759264},
                                   {0.0083161484, -0.0060324498, 0.9977163014}};
    const std::tuple<Gamut, Gamut, const double(*)[3], double> cases[] = {{Rec709, Rec2020, bt2087, 1e-4},
                                                                          {AP0, AP1, ap0ToAp1, 2e-6}};
    for (const auto &[from, to, m, tol] : cases) {
        auto set = [&](Operator *op) { T::SetNumbers(op, Convert(from, Linear, to, Linear)); };
        auto model = [&](const Image &, const Px &p) {
            Px w{0, 0, 0, p[3]};
            for (int r = 0; r < 3; ++r) w[r] = m[r][0] * p[0] + m[r][1] * p[1] + m[r][2] * p[2];
            return w;
        };
        ExpectFrameRules("GamutConvert", set, model, tol);
    }
}

TEST_F(GamutConvertTest, WhiteStaysWhiteBetweenEveryPair) {
    // The whites are adapted, so equal RGB stays equal RGB from any gamut to any other.
    const std::vector<Rgb> greys = {{1, 1, 1}, {0.18, 0.18, 0.18}};
    for (int from = Rec709; from <= AP1; ++from)
        for (int to = Rec709; to <= AP1; ++to) {
            SCOPED_TRACE(std::to_string(from) + " -> " + std::to_string(to));
            ExpectColoursNear(Through(greys, {Convert(Gamut(from), Linear, Gamut(to), Linear)}), greys, 2e-6);
        }
}

TEST_F(GamutConvertTest, CurvesAndRoundTrips) {
    const auto srgb = [](double v) { return v <= 0.04045 ? v / 12.92 : std::pow((v + 0.055) / 1.055, 2.4); };
    ExpectColoursNear(Through({{0.02, 0.5, 1}}, {Convert(Rec709, SRGB, Rec709, Linear)}), {{srgb(0.02), srgb(0.5), 1}},
                      2e-5);
    ExpectColoursNear(Through({{0.5, 0.25, 1}}, {Convert(Rec709, Gamma, Rec709, Linear)}), // the default gamma, 2.2
                      {{std::pow(0.5, 2.2), std::pow(0.25, 2.2), 1}}, 2e-5);
    const std::tuple<Gamut, Curve, Gamut, Curve> trips[] = {{Rec709, SRGB, AP1, Cineon},
                                                            {DisplayP3, Rec709Curve, Rec2020, Gamma},
                                                            {DCIP3, Gamma, AP0, Linear},
                                                            {Rec2020, Cineon, Rec709, SRGB}};
    // Colours well inside every gamut, so that no step clamps.
    const std::vector<Rgb> colours = {{0.5, 0.5, 0.5}, {0.4, 0.5, 0.45}, {0.2, 0.3, 0.25}};
    for (const auto &[a, ac, b, bc] : trips)
        ExpectColoursNear(Through(colours, {Convert(a, ac, b, bc), Convert(b, bc, a, ac)}), colours, 1e-4);
}

} // namespace Orvane::colortest::gamut
