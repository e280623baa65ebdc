// WhiteBalance: a picked colour becomes the grey of its luminance in either space, temperature whites against
// published chromaticities, forward then reverse gives the input back, neutral settings, a colour it cannot balance,
// and the frame rules.
#include <algorithm>
#include <cmath>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tests/operators/color/GainTestSupport.h"

namespace Orvane::whitebalancetest {
namespace {
using gaintest::Px;
using gaintest::Render;
using gaintest::Rig;
using gaintest::ToPx;

class WhiteBalance : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

double Luminance(const Px &p) { return 0.2126 * p[0] + 0.7152 * p[1] + 0.0722 * p[2]; }

/// A float image of the given pixels in one row.
Ref<Image> Row(const std::vector<Px> &pixels, int depth = DepthRGBAFlt32) {
    Ref<Image> img = NewImageTagList({{ImgWidth, static_cast<int>(pixels.size())}, {ImgHeight, 1}, {ImgDepth, depth}});
    img->AllocScanLineData();
    for (size_t i = 0; i < pixels.size(); ++i) {
        const Px &p = pixels[i];
        img->PutFlt(
            static_cast<int>(i), 0,
            {static_cast<float>(p[0]), static_cast<float>(p[1]), static_cast<float>(p[2]), static_cast<float>(p[3])});
    }
    return img;
}

void Picked(Operator *op, const Px &n, double space) {
    Orvane::Test::SetNumbers(
        op, {{"Method", 0}, {"Space", space}, {"NeutralRed", n[0]}, {"NeutralGreen", n[1]}, {"NeutralBlue", n[2]}});
}

/// Linear Rec. 709 RGB of the white at CIE xy (luminance 1), with the published XYZ to RGB matrix.
Px WhiteOf(double x, double y) {
    const double X = x / y, Z = (1 - x - y) / y;
    return {3.2404542 * X - 1.5371385 - 0.4985314 * Z, -0.9692660 * X + 1.8760108 + 0.0415560 * Z,
            0.0556434 * X - 0.2040259 + 1.0572252 * Z, 1};
}

TEST_F(WhiteBalance, APickedColourBecomesTheGreyOfItsLuminance) {
    const Px picked[] = {{0.8, 0.5, 0.3, 1}, {0.2, 0.25, 0.6, 1}, {1.4, 1.1, 0.9, 1}, {0.05, 0.5, 0.05, 1}};
    for (double space : {0.0, 1.0})
        for (const Px &n : picked) {
            SCOPED_TRACE(std::to_string(n[0]) + "," + std::to_string(n[1]) + "," + std::to_string(n[2]) +
                         (space ? " cones" : " RGB"));
            const Px other{0.3, 0.7, 0.1, 0.5}, premultiplied{n[0] * 0.4, n[1] * 0.4, n[2] * 0.4, 0.4};
            Rig rig("WhiteBalance", Row({n, other, premultiplied}));
            Picked(rig.tool, n, space);
            Ref<Image> out = Render(rig.tool);
            ASSERT_TRUE(out);
            const double y = Luminance(n);
            for (int c = 0; c < 3; ++c) {
                EXPECT_NEAR(ToPx(out->GetFlt(0, 0))[c], y, 2e-6 * (1 + y));
                EXPECT_NEAR(ToPx(out->GetFlt(2, 0))[c], 0.4 * y, 2e-6); // premultiplied: the same grey times alpha
                if (space == 0)                                         // RGB: each channel scaled on its own
                    EXPECT_NEAR(ToPx(out->GetFlt(1, 0))[c], other[c] * y / n[c], 2e-6 * (1 + other[c] * y / n[c]));
            }
            EXPECT_EQ(out->GetFlt(1, 0).A, 0.5f);
        }
}

TEST_F(WhiteBalance, TemperatureWhitesMatchPublishedChromaticities) {
    // Planckian whites: 2856 K (CIE illuminant A), 5000 K and 6500 K. The white of one temperature becomes the white
    // of the target, to the accuracy of the locus approximation.
    struct Case {
        double kelvin, x, y;
    };
    const Case whites[] = {{2856, 0.44757, 0.40745}, {5000, 0.3451, 0.3516}, {6500, 0.3135, 0.3236}};
    for (const Case &from : whites)
        for (const Case &to : whites) {
            if (from.kelvin == to.kelvin) continue;
            SCOPED_TRACE(std::to_string(from.kelvin) + " K to " + std::to_string(to.kelvin) + " K");
            for (double space : {0.0, 1.0}) {
                Rig rig("WhiteBalance", Row({WhiteOf(from.x, from.y)}));
                Orvane::Test::SetNumbers(
                    rig.tool,
                    {{"Method", 1}, {"Space", space}, {"Temperature", from.kelvin}, {"TargetTemperature", to.kelvin}});
                Ref<Image> out = Render(rig.tool);
                ASSERT_TRUE(out);
                const Px want = WhiteOf(to.x, to.y);
                for (int c = 0; c < 3; ++c) EXPECT_NEAR(ToPx(out->GetFlt(0, 0))[c], want[c], 0.01) << c;
            }
        }
    // Tint: a source white assumed greener is corrected by taking green away.
    Rig rig("WhiteBalance", Row({{1, 1, 1, 1}}));
    Orvane::Test::SetNumbers(rig.tool, {{"Method", 1}, {"Tint", 10}});
    Ref<Image> out = Render(rig.tool);
    ASSERT_TRUE(out);
    const FltPixel p = out->GetFlt(0, 0);
    EXPECT_LT(p.G, p.R - 0.01);
    EXPECT_LT(p.G, p.B - 0.01);
}

TEST_F(WhiteBalance, ForwardThenReverseGivesTheInputBack) {
    const std::pair<const char *, std::vector<std::pair<const char *, double>>> cases[] = {
        {"picked, RGB", {{"Space", 0}, {"NeutralRed", 0.7}, {"NeutralGreen", 0.5}, {"NeutralBlue", 0.2}}},
        {"picked, cones", {{"NeutralRed", 0.3}, {"NeutralGreen", 0.6}, {"NeutralBlue", 0.9}}},
        {"temperature, tint", {{"Method", 1}, {"Temperature", 3200}, {"Tint", -7}, {"TargetTemperature", 7500}}},
    };
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16})
        for (const auto &[name, values] : cases) {
            SCOPED_TRACE(std::string(name) + ", depth " + std::to_string(depth));
            Ref<Image> src = Orvane::Test::PatternImage(40, 9, depth, 11);
            Rig rig("WhiteBalance", src);
            Operator *back = rig.doc.AddTool(OvID("WhiteBalance"));
            ASSERT_TRUE(back && back->FindInput("Input")->ConnectTo(rig.tool->FindMainOutput()));
            Orvane::Test::SetNumbers(rig.tool, values);
            Orvane::Test::SetNumbers(back, values);
            Orvane::Test::SetNumber(back, "Direction", 1);
            Ref<Image> there = Render(rig.tool), out = Render(back);
            ASSERT_TRUE(there && out);
            // The colours did move; integers clamp on the way, so only the values that stayed in range come back.
            EXPECT_GT(std::fabs(there->GetFlt(3, 3).R - src->GetFlt(3, 3).R), 1e-3);
            const double tol = depth == DepthRGBAFlt32 ? 1e-5 : depth == DepthRGBAFlt16 ? 4e-3 : 3.0 / 65535;
            for (int y = 0; y < 9; ++y)
                for (int x = 0; x < 40; ++x) {
                    const Px mid = ToPx(there->GetFlt(x, y)), in = ToPx(src->GetFlt(x, y));
                    if (depth == DepthRGBAInt16 && (*std::min_element(mid.begin(), mid.end()) <= 0 ||
                                                    *std::max_element(mid.begin(), mid.end()) >= 1))
                        continue;
                    for (int c = 0; c < 4; ++c)
                        ASSERT_NEAR(ToPx(out->GetFlt(x, y))[c], in[c], tol * std::max(1.0, std::fabs(in[c])))
                            << x << "," << y << " channel " << c;
                }
        }
}

TEST_F(WhiteBalance, NeutralSettingsHandTheInputOnAndAColourWithoutRedFails) {
    Ref<Image> src = Orvane::Test::PatternImage(8, 4, DepthRGBAFlt16);
    Rig rig("WhiteBalance", src);
    const std::vector<std::pair<const char *, double>> neutral[] = {
        {},
        {{"NeutralRed", 0.3}, {"NeutralGreen", 0.3}, {"NeutralBlue", 0.3}},
        {{"Method", 1}, {"Temperature", 3000}, {"Tint", 4}, {"TargetTemperature", 3000}, {"TargetTint", 4}},
    };
    for (const auto &values : neutral) {
        Orvane::Test::SetNumbers(rig.tool, values);
        EXPECT_EQ(Render(rig.tool).Get(), src.Get());
    }
    Orvane::Test::SetNumbers(rig.tool, {{"Method", 0}, {"Space", 0}, {"NeutralRed", 0}});
    EXPECT_EQ(Render(rig.tool), nullptr);
    const auto lines = rig.doc.ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].text.rfind(rig.tool->Name() + ": the neutral color", 0), 0u) << lines[0].text;
}

TEST_F(WhiteBalance, FrameRules) {
    const Px n{0.6, 0.45, 0.3, 1};
    gaintest::ExpectFrameRules(
        "WhiteBalance", [&](Operator *op) { Picked(op, n, 0); },
        [&](const Image &, const Px &p) {
            const double y = Luminance(n);
            return Px{p[0] * y / n[0], p[1] * y / n[1], p[2] * y / n[2], p[3]};
        },
        2e-6);
}

} // namespace
} // namespace Orvane::whitebalancetest
