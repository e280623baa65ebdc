// Color Curves and Hue Curves: every pixel at every depth against the curves evaluated in double (the curves are pinned
// by hand values in the spline tests), hand-worked values, the frame, hand-on, documents, malformed curves.
#include <gtest/gtest.h>

#include "host/color/ColorSpace.h"
#include "host/color/SplineCurve.h"
#include "host/flow/DocumentIO.h"
#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class CurveTools : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

using Points = std::vector<CurvePoint>;
const Points kIdentityCurve{{0, 0}, {1, 1}};

void SetCurve(Operator *op, const char *id, const Points &points) {
    ASSERT_TRUE(op->FindInput(id)->SetValue(MakeRef<SplineCurve>(points))) << id;
}

/// Colour Curves in double: the channel's curve after the luminance curve (colour only), straight beyond 0..1.
PixelModel ColorCurvesModel(const std::array<Points, 5> &curves) {
    return [curves](const Px &p) {
        const Spline luma = SplineCurve(curves[4]).ToSpline(false);
        Px out;
        for (int c = 0; c < 4; ++c) {
            const Spline ch = SplineCurve(curves[c]).ToSpline(false);
            auto f = [&](double v) { return ch(c < 3 ? luma(v) : v); };
            auto d = [&](double v) { return c < 3 ? ch.Slope(luma(v)) * luma.Slope(v) : ch.Slope(v); };
            out[c] = p[c] < 0 ? f(0) + p[c] * d(0) : p[c] > 1 ? f(1) + (p[c] - 1) * d(1) : f(p[c]);
        }
        return out;
    };
}

TEST_F(CurveTools, ColorCurvesFollowTheCurvesAtEveryDepthAndTheFrameHolds) {
    const Points rising{{0, 0.05}, {0.3, 0.5}, {0.7, 0.8}, {1, 0.9}}, falling{{0, 1}, {0.4, 0.3}, {1, 0}};
    const Points wavy{{0, 0.2}, {0.35, 0.9}, {0.5, 0.1}, {0.8, 0.8}}, gamma{{0, 0}, {0.25, 0.5}, {1, 1}};
    // Each channel its own curve; then luminance alone, which moves the colour but not alpha.
    const std::array<Points, 5> cases[] = {{rising, falling, wavy, gamma, kIdentityCurve},
                                           {kIdentityCurve, kIdentityCurve, falling, kIdentityCurve, gamma}};
    for (const auto &curves : cases) {
        const char *ids[] = {"Red", "Green", "Blue", "Alpha", "Luminance"};
        ExpectFrame("ColorCurves",
                    {{[&](Operator *op) {
                          for (int i = 0; i < 5; ++i) SetCurve(op, ids[i], curves[i]);
                      },
                      ColorCurvesModel(curves)}},
                    1e-9);
    }
}

TEST_F(CurveTools, FloatValuesBeyondZeroToOneGoOnStraight) {
    // Red (0,0) (0.5,0.25) (1,1): 0.09375 at 0.25, slope 0.5 below 0 and 1.5 above 1. Through luminance 2x the
    // composed curve is red(2x): 0.25 at 0.25, 2.5 at 1 with slope 1.5 * 2 above.
    Ref<Image> img = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    const float xs[4] = {-0.5f, 0.25f, 0.75f, 1.5f};
    for (int x = 0; x < 4; ++x) img->PutFlt(x, 0, {xs[x], 0.5f, 0.5f, xs[x]});
    const double plain[4] = {-0.25, 0.09375, 0.59375, 1.75}, doubled[4] = {-0.5, 0.25, 1.75, 4.0};
    for (bool throughLuma : {false, true}) {
        Rig rig("ColorCurves", img);
        SetCurve(rig.tool, "Red", {{0, 0}, {0.5, 0.25}, {1, 1}});
        if (throughLuma) SetCurve(rig.tool, "Luminance", {{0, 0}, {1, 2}});
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out);
        for (int x = 0; x < 4; ++x) {
            EXPECT_NEAR(out->GetFlt(x, 0).R, (throughLuma ? doubled : plain)[x], 2e-7) << x;
            EXPECT_EQ(out->GetFlt(x, 0).A, xs[x]); // alpha's curve is the identity
        }
    }
    // Values that are not finite do no harm: NaN stays NaN through a curve, and hues of them are no hues.
    img->PutFlt(0, 0, {NAN, INFINITY, -INFINITY, 1});
    for (const auto &[id, input] : {std::pair{"ColorCurves", "Red"}, {"HueCurves", "Hue"}}) {
        Rig rig(id, img);
        SetCurve(rig.tool, input, {{0.2, 0.1}, {0.7, 0.3}});
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out);
        EXPECT_TRUE(std::string(id) == "HueCurves" || std::isnan(out->GetFlt(0, 0).R));
    }
}

/// Hue Curves in double: HLS, the three curves read at the hue, back to RGB.
PixelModel HueCurvesModel(const std::array<Points, 3> &curves) {
    return [curves](const Px &p) {
        double rgb[3] = {p[0], p[1], p[2]}, hls[3];
        RGBToSpaceDouble(ColorSpaceType::HLS, rgb, hls);
        const double h = hls[0];
        hls[0] += SplineCurve(curves[0]).ToSpline(true)(h);
        hls[1] *= 1 + (SplineCurve(curves[2]).ToSpline(true)(h) - 1) * std::clamp(hls[2], 0.0, 1.0);
        hls[2] *= std::max(0.0, SplineCurve(curves[1]).ToSpline(true)(h));
        SpaceToRGBDouble(ColorSpaceType::HLS, hls, rgb);
        return Px{rgb[0], rgb[1], rgb[2], p[3]};
    };
}

TEST_F(CurveTools, HueCurvesFollowTheCurvesAtEveryDepthAndTheFrameHolds) {
    const Points noShift{{0, 0}}, unit{{0, 1}};
    const std::array<Points, 3> cases[] = {
        {Points{{0.0, 0.1}, {0.4, -0.05}, {0.7, 0.2}}, unit, unit},
        {noShift, Points{{0.1, 1.8}, {0.5, -0.5}, {0.9, 1}}, Points{{0.2, 0.5}, {0.6, 1.4}}},
    };
    for (const auto &curves : cases)
        ExpectFrame("HueCurves",
                    {{[&](Operator *op) {
                          SetCurve(op, "Hue", curves[0]), SetCurve(op, "Saturation", curves[1]);
                          SetCurve(op, "Luminance", curves[2]);
                      },
                      HueCurvesModel(curves)}},
                    2e-8); // tables read between samples 1/65535 turn apart: ~1e-9 off the curve
}

TEST_F(CurveTools, HueCurvesOnPrimariesAndGreysWorkedOutByHand) {
    // Pure red (hue 0, L 0.5, S 1): a third of a turn makes it green; no saturation makes it the grey of its
    // lightness; half the luminance halves L. A grey has no hue and stays.
    const struct {
        Points hue, saturation, luminance;
        FltPixel in, want;
    } cases[] = {
        {{{0, 1.0 / 3}}, {{0, 1}}, {{0, 1}}, {1, 0, 0, 1}, {0, 1, 0, 1}},
        {{{0, 0}}, {{0, 0}}, {{0, 1}}, {1, 0, 0, 1}, {0.5f, 0.5f, 0.5f, 1}},
        {{{0, 0}}, {{0, 1}}, {{0, 0.5}}, {1, 0, 0, 0.5f}, {0.5f, 0, 0, 0.5f}},
        {{{0, 0.3}}, {{0, 3}}, {{0, 2}}, {0.4f, 0.4f, 0.4f, 1}, {0.4f, 0.4f, 0.4f, 1}},
    };
    for (const auto &c : cases) {
        Ref<Image> img = NewImageTagList({{ImgWidth, 1}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
        img->AllocScanLineData();
        img->PutFlt(0, 0, c.in);
        Rig rig("HueCurves", img);
        SetCurve(rig.tool, "Hue", c.hue), SetCurve(rig.tool, "Saturation", c.saturation);
        SetCurve(rig.tool, "Luminance", c.luminance);
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out);
        Orvane::Test::ExpectPixelNear(out->GetFlt(0, 0), c.want, 1e-6);
    }
}

TEST_F(CurveTools, NeutralCurvesHandTheInputOn) {
    Ref<Image> src = Orvane::Test::PatternImage(8, 4, DepthRGBAInt16);
    Rig color("ColorCurves", src), hue("HueCurves", src);
    SetCurve(color.tool, "Green", {{0, 0}, {0.5, 0.5}, {1, 1}}); // more points, still the identity
    SetCurve(hue.tool, "Saturation", {{0.3, 1}, {0.6, 1}});
    EXPECT_EQ(Render(color.tool).Get(), src.Get());
    EXPECT_EQ(Render(hue.tool).Get(), src.Get());
    SetCurve(hue.tool, "Hue", {{0.5, 1e-9}});
    SetCurve(color.tool, "Alpha", {{0.5, 0.5}}); // one point is flat, not the identity
    EXPECT_NE(Render(hue.tool).Get(), src.Get());
    EXPECT_NE(Render(color.tool).Get(), src.Get());
}

TEST_F(CurveTools, CurvesSurviveASavedDocument) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Operator *color = doc->AddTool(OvID("ColorCurves")), *hue = doc->AddTool(OvID("HueCurves"));
    ASSERT_TRUE(color && hue);
    EXPECT_TRUE(color->FindInput("Blue")->Default()->Equals(SplineCurve()));
    EXPECT_TRUE(hue->FindInput("Saturation")->Default()->Equals(*SplineCurve::Flat(1)));
    SetCurve(color, "Blue", {{0, 0.1}, {0.33, 0.7}, {1, 0.95}});
    SetCurve(hue, "Hue", {{0.1, -0.2}, {0.6, 0.123456789012345}});
    const std::string text = SaveDocument(*doc);
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    const DocumentLoadResult loaded = LoadDocument(text, *again);
    ASSERT_TRUE(loaded.ok) << loaded.error;
    for (const auto &[tool, id] : {std::pair{color, "Blue"}, {hue, "Hue"}})
        EXPECT_TRUE(again->FindTool(tool->Name())->FindInput(id)->Constant()->Equals(*tool->FindInput(id)->Constant()));
    EXPECT_EQ(SaveDocument(*again), text);

    std::string broken = text;
    const size_t at = broken.find("0.123456789012345");
    ASSERT_NE(at, std::string::npos) << text;
    broken.replace(at, 17, "\"high\"");
    Ref<OrvaneDoc> bad = MakeRef<OrvaneDoc>();
    const DocumentLoadResult refused = LoadDocument(broken, *bad);
    EXPECT_FALSE(refused.ok && refused.warnings.empty());
}

TEST_F(CurveTools, AMalformedCurveFailsWithOneLine) {
    const struct {
        const char *tool, *input;
        Points points;
        const char *line;
    } cases[] = {
        {"ColorCurves", "Green", {{0, 0}, {0.5, 0.2}, {0.5, 0.6}, {1, 1}}, "the Green curve has two points at x = 0.5"},
        {"ColorCurves", "Luminance", {}, "the Luminance curve has no points"},
        {"HueCurves", "Saturation", {{0.5, 1}, {1, 2}}, "the Saturation curve has a point outside 0 <= x < 1 (x = 1)"},
    };
    for (const auto &c : cases) {
        Rig rig(c.tool, Orvane::Test::PatternImage(8, 4));
        rig.tool->SetName("Curves1");
        SetCurve(rig.tool, c.input, c.points);
        EXPECT_FALSE(Render(rig.tool));
        EXPECT_EQ(Orvane::Test::ConsoleText(rig.doc), std::string("error: Curves1: ") + c.line + "\n");
    }
}

} // namespace
} // namespace Orvane::colortest
