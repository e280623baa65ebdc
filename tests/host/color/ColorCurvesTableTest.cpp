// The range curves: weights against the curves' formulas, the sum rule, presets, and the document form.
#include <cmath>
#include <limits>

#include <gtest/gtest.h>

#include "host/color/ColorCurvesTable.h"
#include "host/flow/DataTypes.h"

namespace Orvane {
namespace {

double SmoothStep(double t) { return t * t * (3 - 2 * t); }

/// The presets' weights at luminance x (already clamped), written from their description.
void PresetWeights(bool smooth, double x, double &s, double &m, double &h) {
    s = x < 0.5 ? 1.0 - x / 0.5 : 0.0;
    h = x > 0.5 ? (x - 0.5) / 0.5 : 0.0;
    if (smooth) s = x < 0.5 ? 1.0 - SmoothStep(x / 0.5) : 0.0, h = x > 0.5 ? SmoothStep((x - 0.5) / 0.5) : 0.0;
    m = 1.0 - s - h;
}

TEST(ColorCurvesTable, PresetWeightsFollowTheirCurvesAtTheNearestSample) {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    for (bool smooth : {false, true}) {
        const ColorCurvesTable t(smooth ? ColorCurvesTable::Preset::Smooth : ColorCurvesTable::Preset::Simple);
        // Luminance, the luminance the weights are read at (clamped; NaN reads as black).
        const std::pair<double, double> cases[] = {{0.0, 0.0}, {0.1, 0.1},  {0.25, 0.25}, {0.5, 0.5}, {0.73, 0.73},
                                                   {1.0, 1.0}, {-0.4, 0.0}, {3.0, 1.0},   {nan, 0.0}};
        for (const auto &[L, at] : cases) {
            float s, m, h;
            t.WeightsAt(static_cast<float>(L), s, m, h);
            double es, em, eh;
            PresetWeights(smooth, at, es, em, eh);
            // One sample is 1/1023 of luminance; the steepest slope is 3 (smooth), so the reading is within 3/2046.
            const double tol = 3.0 / 2046 + 1e-6;
            EXPECT_NEAR(s, es, tol) << L;
            EXPECT_NEAR(m, em, tol) << L;
            EXPECT_NEAR(h, eh, tol) << L;
            EXPECT_NEAR(s + m + h, 1.0, 1e-6);
        }
    }
}

TEST(ColorCurvesTable, OverlappingCurvesShareTheWeightAndMidtonesNeverGoNegative) {
    // Shadows 0.8 everywhere, highlights rising 0 -> 1: together above 1 from x = 0.2 on.
    const ColorCurvesTable t(RangeCurve{{{0.0, 0.8}}, false}, RangeCurve{{{0.0, 0.0}, {1.0, 1.0}}, false});
    for (int i = 0; i <= 11; ++i) {
        const double x = i * 93 / 1023.0; // on the table's samples
        float s, m, h;
        t.WeightsAt(static_cast<float>(x), s, m, h);
        const double over = 0.8 + x;
        EXPECT_NEAR(s, over > 1 ? 0.8 / over : 0.8, 1e-6) << x;
        EXPECT_NEAR(h, over > 1 ? x / over : x, 1e-6) << x;
        EXPECT_GE(m, 0.f);
        EXPECT_NEAR(s + m + h, 1.0, 1e-6);
    }
    // Points given out of order are sorted; outside them the end weights hold; weights clamp to 0..1.
    const RangeCurve c{{{0.8, 2.0}, {0.2, -1.0}}, false};
    const std::pair<double, double> at[] = {{0.0, 0.0}, {0.2, 0.0}, {0.5, 0.5}, {0.65, 1.0}, {1.0, 1.0}};
    const ColorCurvesTable sorted(c, c);
    for (const auto &[x, y] : at) EXPECT_NEAR(sorted.Shadows().Evaluate(x), y, 1e-12) << x;
}

TEST(ColorCurvesTable, DocumentFormRoundTripsAndMalformedFormsAreRefused) {
    const ColorCurvesTable custom(RangeCurve{{{0.0, 1.0}, {0.3, 0.25}, {0.6, 0.0}}, true},
                                  RangeCurve{{{0.4, 0.0}, {0.95, 1.0}}, false});
    const ColorCurvesTable smooth(ColorCurvesTable::Preset::Smooth), simple;
    for (const ColorCurvesTable *t : {&custom, &smooth, &simple}) {
        const std::string text = t->ToScript().ToText();
        Ref<ColorCurvesTable> back = ColorCurvesTable::FromScript(ScriptVal::FromText(text));
        ASSERT_TRUE(back) << text;
        EXPECT_TRUE(back->Equals(*t) && t->Equals(*back));
        EXPECT_EQ(back->Hash(), t->Hash());
        EXPECT_EQ(back->ToScript().ToText(), text);
        EXPECT_EQ(back->DataType(), CLSID_DataType_ColorCurves);
    }
    EXPECT_FALSE(custom.Equals(ColorCurvesTable()));
    EXPECT_NE(custom.Hash(), ColorCurvesTable().Hash());
    EXPECT_NE(smooth.Hash(), simple.Hash());

    const char *const bad[] = {
        "7",
        "Gradient { Shadows = { Points = { { 0, 1 } } }, Highlights = { Points = { { 0, 1 } } } }",
        "ColorCurves { Shadows = { Points = { { 0, 1 } } } }",
        "ColorCurves { Shadows = { Points = { } }, Highlights = { Points = { { 0, 1 } } } }",
        "ColorCurves { Shadows = { Points = { { 0, 1, 2 } } }, Highlights = { Points = { { 0, 1 } } } }",
        "ColorCurves { Shadows = { Points = { { 0, 'a' } } }, Highlights = { Points = { { 0, 1 } } } }",
        "ColorCurves { Shadows = { Smooth = 1, Points = { { 0, 1 } } }, Highlights = { Points = { { 0, 1 } } } }",
        "ColorCurves { Shadows = { Points = { { 0, 1 }, x = 2 } }, Highlights = { Points = { { 0, 1 } } } }",
    };
    for (const char *text : bad) EXPECT_FALSE(ColorCurvesTable::FromScript(ScriptVal::FromText(text))) << text;
    // A plain table with both curves is accepted.
    EXPECT_TRUE(ColorCurvesTable::FromScript(
        ScriptVal::FromText("{ Shadows = { Points = { { 0, 1 } } }, Highlights = { Points = { { 1, 1 } } } }")));
}

} // namespace
} // namespace Orvane
