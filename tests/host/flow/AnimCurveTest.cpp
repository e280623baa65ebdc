#include <cmath>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "tests/support/TestSupport.h"

namespace Orvane::animcurvetest {
namespace {

double At(const AnimCurve &c, double t) {
    Ref<Parameter> v = c.ValueAt(t);
    auto *n = dynamic_cast<const Number *>(v.Get());
    EXPECT_NE(n, nullptr) << "at " << t;
    return n ? n->value : NAN;
}

bool ReadCurve(const std::string &text, OvID type, AnimCurve &out) {
    return AnimCurve::FromScript(
        ScriptVal::FromText(text), [type](const ScriptVal &v) { return ParameterFromScript(type, v); }, out);
}

TEST(AnimCurve, LinearAndHoldMeetTheirKeysHoldAtTheEndsAndKeysAreReplacedAndRemoved) {
    const AnimCurve linear = Orvane::Test::NumberCurve({{0, 1}, {10, 3}, {14, -5}, {20, -5}}, KeyInterp::Linear);
    const std::pair<double, double> onLinear[] = {
        {0, 1},    {10, 3},     {14, -5},     {20, -5},            // keys
        {5, 2},    {2.5, 1.5},  {12, -1},     {13, -3},  {17, -5}, // on the lines
        {-100, 1}, {-0.001, 1}, {20.001, -5}, {1e9, -5},           // the ends hold
    };
    for (const auto &[t, v] : onLinear) EXPECT_DOUBLE_EQ(At(linear, t), v) << "linear, t = " << t;
    AnimCurve hold = Orvane::Test::NumberCurve({{0, 1}, {10, 3}, {20, 7}}, KeyInterp::Hold);
    const std::pair<double, double> onHold[] = {{0, 1},      {0.5, 1}, {9.999, 1}, {10, 3}, {15, 3},
                                                {19.999, 3}, {20, 7},  {50, 7},    {-3, 1}};
    for (const auto &[t, v] : onHold) EXPECT_EQ(At(hold, t), v) << "hold, t = " << t;
    // The interpolation belongs to the key that starts a span.
    hold.SetKey(10, MakeRef<Number>(3.0), KeyInterp::Linear);
    EXPECT_EQ(At(hold, 5), 1.0);
    EXPECT_DOUBLE_EQ(At(hold, 15), 5.0);
    // Setting a key at an existing time replaces it; removing takes it out.
    AnimCurve c = Orvane::Test::NumberCurve({{10, 1}, {0, 5}, {5, 2}}, KeyInterp::Linear);
    c.SetKey(5, MakeRef<Number>(9.0), KeyInterp::Hold);
    EXPECT_EQ(c.Keys().size(), 3u);
    EXPECT_EQ(At(c, 7), 9.0) << "the replacing key's value and interpolation";
    EXPECT_TRUE(c.RemoveKey(5) && !c.RemoveKey(5));
    EXPECT_DOUBLE_EQ(At(c, 5), 3.0) << "between the keys at 0 and 10";
    EXPECT_FALSE(AnimCurve().ValueAt(0));
}

TEST(AnimCurve, SmoothPassesThroughKeysWithMatchingSlopesAndPointsFollowTheirComponents) {
    // Uneven spacing, so that tangents must be scaled to each span.
    const std::vector<std::pair<double, double>> keys{{0, 0}, {4, 2}, {5, -1}, {12, 3}, {20, 3.5}};
    const AnimCurve c = Orvane::Test::NumberCurve(keys, KeyInterp::Smooth);
    const double h = 1e-5;
    auto slope = [&](double t0, double t1) { return (At(c, t1) - At(c, t0)) / h; };
    for (size_t i = 0; i < keys.size(); ++i) {
        const auto [t, v] = keys[i];
        EXPECT_NEAR(At(c, t), v, 1e-12) << "key at " << t;
        // Both sides agree and follow the neighbours' chord; flat at both ends.
        const auto &prev = keys[i ? i - 1 : i], &next = keys[i + 1 < keys.size() ? i + 1 : i];
        const double chord =
            i == 0 || i + 1 == keys.size() ? 0.0 : (next.second - prev.second) / (next.first - prev.first);
        if (i > 0) {
            EXPECT_NEAR(slope(t - h, t), chord, 1e-3) << "left of " << t;
        }
        if (i + 1 < keys.size()) {
            EXPECT_NEAR(slope(t, t + h), chord, 1e-3) << "right of " << t;
        }
    }
    // A smooth span of two keys alone is the smoothstep between them.
    const AnimCurve two = Orvane::Test::NumberCurve({{0, 2}, {10, 6}}, KeyInterp::Smooth);
    for (double u : {0.1, 0.25, 0.5, 0.8}) EXPECT_NEAR(At(two, 10 * u), 2 + 4 * (3 * u * u - 2 * u * u * u), 1e-12);
    for (const KeyInterp interp : {KeyInterp::Linear, KeyInterp::Smooth, KeyInterp::Hold}) {
        SCOPED_TRACE(KeyInterpName(interp));
        // Each component follows the curve of its own numbers.
        AnimCurve points, texts, ids;
        const AnimCurve xs = Orvane::Test::NumberCurve({{0, 0}, {8, 4}, {10, 5}}, interp),
                        ys = Orvane::Test::NumberCurve({{0, 10}, {8, 2}, {10, -2}}, interp);
        for (const auto &[t, text] : {std::pair{0.0, "first"}, {8.0, "second"}, {10.0, "third"}}) {
            points.SetKey(t, MakeRef<Point>(At(xs, t), At(ys, t)), interp);
            texts.SetKey(t, MakeRef<Text>(text), interp);
            if (t < 10) ids.SetKey(t, MakeRef<IDValue>(OvID(text)), interp);
        }
        for (double t : {-1.0, 0.0, 1.0, 4.0, 7.5, 8.0, 9.0, 12.0}) {
            const Ref<Parameter> v = points.ValueAt(t);
            auto *p = dynamic_cast<const Point *>(v.Get());
            ASSERT_NE(p, nullptr);
            EXPECT_DOUBLE_EQ(p->x, At(xs, t)) << "t = " << t;
            EXPECT_DOUBLE_EQ(p->y, At(ys, t)) << "t = " << t;
            const char *held = t < 8 ? "first" : t < 10 ? "second" : "third";
            EXPECT_EQ(dynamic_cast<const Text &>(*texts.ValueAt(t)).value, held) << "t = " << t;
            EXPECT_EQ(dynamic_cast<const IDValue &>(*ids.ValueAt(t)).value, OvID(t < 8 ? "first" : "second")) << t;
        }
    }
}

TEST(AnimCurve, TheDocumentFormRoundTripsAndMalformedFormsAreRefused) {
    AnimCurve c;
    c.SetKey(0, MakeRef<Number>(1.0));
    c.SetKey(12.5, MakeRef<Number>(-0.1), KeyInterp::Smooth);
    c.SetKey(24, MakeRef<Number>(1e-9), KeyInterp::Hold);
    c.SetKey(30, MakeRef<Number>(2.0 / 3.0));
    const ScriptVal form = c.ToScript();
    EXPECT_EQ(form.ClassName(), "Curve");
    ASSERT_EQ(form.ArrayLength(), 4u);
    // Linear is not written.
    EXPECT_EQ(form.At(1)->ToText() + " " + form.At(2)->ToText(), "{ 0, 1 } { 12.5, -0.1, Interp = \"Smooth\" }");
    AnimCurve back, points, pointsBack;
    ASSERT_TRUE(ReadCurve(form.ToText(), CLSID_DataType_Number, back));
    EXPECT_EQ(back.ToScript(), form);
    points.SetKey(1, MakeRef<Point>(0.25, -3.0), KeyInterp::Smooth);
    points.SetKey(2, MakeRef<Point>(1e6, 0.1));
    ASSERT_TRUE(ReadCurve(points.ToScript().ToText(), CLSID_DataType_Point, pointsBack));
    EXPECT_EQ(pointsBack.ToScript(), points.ToScript());
    // No key, a key without value, a time that is no number, a value of the wrong type, unknown interpolations, another
    // class, no class, no table.
    for (const char *text : {"Curve { }", "Curve { { 0 } }", "Curve { { \"a\", 1 } }", "Curve { { 0, \"x\" } }",
                             "Curve { { 0, 1, Interp = \"Wobbly\" } }", "Curve { { 0, 1, Interp = 3 } }",
                             "NotACurve { { 0, 1 } }", "{ { 0, 1 } }", "Curve { 5 }"}) {
        AnimCurve out = Orvane::Test::NumberCurve({{3, 3}}, KeyInterp::Linear);
        EXPECT_FALSE(ReadCurve(text, CLSID_DataType_Number, out)) << text;
        EXPECT_TRUE(out.Keys().size() == 1u && out.Keys()[0].time == 3.0) << "a refused form changes nothing: " << text;
    }
}

} // namespace
} // namespace Orvane::animcurvetest
