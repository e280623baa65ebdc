#include "host/flow/Gradient.h"

#include <cmath>
#include <limits>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

#include "host/color/ColorSpace.h"
#include "host/flow/DataTypes.h"

using namespace Orvane;

namespace {

constexpr int kGradRGB = static_cast<int>(ColorSpaceType::RGB);
constexpr int kGradHLS = static_cast<int>(ColorSpaceType::HLS);
constexpr int kGradHSV = static_cast<int>(ColorSpaceType::HSV);
constexpr int kGradLAB = static_cast<int>(ColorSpaceType::LAB);

GradientStop GradStop(double p, float r, float g, float b, float a = 1.0f) { return GradientStop{p, r, g, b, a}; }

struct GradSample {
    float r, g, b, a;
};

GradSample GradEval(const Gradient &grad, double pos, int space = kGradRGB) {
    GradSample s{};
    grad.QuickEvaluate(pos, s.r, s.g, s.b, s.a, space);
    return s;
}

void ExpectGradSample(const GradSample &s, double r, double g, double b, double a, double tol) {
    EXPECT_NEAR(s.r, r, tol);
    EXPECT_NEAR(s.g, g, tol);
    EXPECT_NEAR(s.b, b, tol);
    EXPECT_NEAR(s.a, a, tol);
}

// Exact match with a stop's colour.
void ExpectGradStop(const GradSample &s, const GradientStop &stop) {
    EXPECT_EQ(s.r, stop.r);
    EXPECT_EQ(s.g, stop.g);
    EXPECT_EQ(s.b, stop.b);
    EXPECT_EQ(s.a, stop.a);
}

ScriptVal GradColor(double r, double g, double b, double a) {
    ScriptVal c = ScriptVal::Table();
    c.Append(r);
    c.Append(g);
    c.Append(b);
    c.Append(a);
    return c;
}

ScriptVal GradDoc(ScriptVal colors) {
    ScriptVal v = ScriptVal::Table("Gradient");
    v.Set(std::string_view("Colors"), std::move(colors));
    return v;
}

} // namespace

TEST(Gradient, DefaultIsBlackToWhite) {
    Gradient grad;
    EXPECT_EQ(grad.DataType(), CLSID_DataType_Gradient);
    ASSERT_EQ(grad.Stops().size(), 2u);
    ExpectGradSample(GradEval(grad, 0.0), 0, 0, 0, 1, 0);
    ExpectGradSample(GradEval(grad, 1.0), 1, 1, 1, 1, 0);
    ExpectGradSample(GradEval(grad, 0.25), 0.25, 0.25, 0.25, 1, 1e-7);
    EXPECT_TRUE(grad.IsOpaque());
}

TEST(Gradient, PositionsOutsideClampToEndStops) {
    Gradient grad({GradStop(0.2, 1, 0, 0, 0.5f), GradStop(0.6, 0, 0, 1, 1)});
    for (int space : {kGradRGB, kGradHLS, kGradHSV, kGradLAB}) {
        ExpectGradStop(GradEval(grad, -5.0, space), grad.Stops()[0]);
        ExpectGradStop(GradEval(grad, 0.1, space), grad.Stops()[0]);
        ExpectGradStop(GradEval(grad, 0.7, space), grad.Stops()[1]);
        ExpectGradStop(GradEval(grad, 1e300, space), grad.Stops()[1]);
        ExpectGradStop(GradEval(grad, -std::numeric_limits<double>::infinity(), space), grad.Stops()[0]);
        ExpectGradStop(GradEval(grad, std::numeric_limits<double>::infinity(), space), grad.Stops()[1]);
        ExpectGradStop(GradEval(grad, std::nan(""), space), grad.Stops()[0]);
    }
}

TEST(Gradient, BlendsLinearlyBetweenStopsInRGB) {
    Gradient grad({GradStop(0.2, 1, 0, 0, 1), GradStop(0.6, 0, 0.5f, 1, 0)});
    // A quarter of the way from 0.2 to 0.6.
    ExpectGradSample(GradEval(grad, 0.3), 0.75, 0.125, 0.25, 0.75, 1e-6);
    ExpectGradSample(GradEval(grad, 0.5), 0.25, 0.375, 0.75, 0.25, 1e-6);
    // Colours are straight: a transparent stop's colour still counts fully.
    Gradient fade({GradStop(0, 1, 0, 0, 0), GradStop(1, 0, 0, 1, 1)});
    ExpectGradSample(GradEval(fade, 0.5), 0.5, 0, 0.5, 0.5, 1e-7);
}

TEST(Gradient, SamplesAtStopsReturnTheStop) {
    Gradient grad({GradStop(0, 0.1f, 0.2f, 0.3f, 0.4f), GradStop(0.3, 0.9f, 0.05f, 0.6f, 1),
                   GradStop(0.8, 0.33f, 0.77f, 0.11f, 0.5f), GradStop(1, 1.5f, -0.2f, 0.4f, 1)});
    for (int space : {kGradRGB, kGradHLS, kGradHSV, kGradLAB})
        for (const GradientStop &s : grad.Stops()) ExpectGradStop(GradEval(grad, s.position, space), s);
}

TEST(Gradient, IsContinuousAcrossStopsInEverySpace) {
    Gradient grad({GradStop(0, 0.1f, 0.2f, 0.3f, 0.4f), GradStop(0.3, 0.9f, 0.05f, 0.6f, 1),
                   GradStop(0.8, 0.33f, 0.77f, 0.11f, 0.5f), GradStop(1, 0.7f, 0.7f, 0.7f, 1)});
    for (int space : {kGradRGB, kGradHLS, kGradHSV, kGradLAB})
        for (const GradientStop &s : grad.Stops())
            for (double eps : {-1e-7, 1e-7}) {
                SCOPED_TRACE(testing::Message() << "space " << space << " stop " << s.position << " eps " << eps);
                ExpectGradSample(GradEval(grad, s.position + eps, space), s.r, s.g, s.b, s.a, 1e-5);
            }
}

TEST(Gradient, SortsStopsAndDropsNonFinitePositions) {
    Gradient grad({GradStop(1, 1, 1, 1), GradStop(std::nan(""), 0.5f, 0.5f, 0.5f), GradStop(0, 0, 0, 0),
                   GradStop(std::numeric_limits<double>::infinity(), 1, 0, 0), GradStop(0.5, 0, 1, 0)});
    ASSERT_EQ(grad.Stops().size(), 3u);
    EXPECT_EQ(grad.Stops()[0].position, 0.0);
    EXPECT_EQ(grad.Stops()[1].position, 0.5);
    EXPECT_EQ(grad.Stops()[2].position, 1.0);
    ExpectGradSample(GradEval(grad, 0.25), 0, 0.5, 0, 1, 1e-7);
    ExpectGradSample(GradEval(grad, 0.75), 0.5, 1, 0.5, 1, 1e-7);
}

TEST(Gradient, SortingKeepsTheOrderOfSharedPositions) {
    // Enough stops that a sort which is not stable would reorder them: stop k
    // sits at position k % 3 and carries k in its red channel.
    std::vector<GradientStop> stops;
    for (int k = 0; k < 60; ++k) stops.push_back(GradStop((59 - k) % 3, static_cast<float>(k), 0, 0));
    Gradient grad(stops);
    ASSERT_EQ(grad.Stops().size(), 60u);
    for (size_t i = 1; i < 60; ++i) {
        const GradientStop &prev = grad.Stops()[i - 1], &cur = grad.Stops()[i];
        ASSERT_LE(prev.position, cur.position);
        if (prev.position == cur.position) {
            ASSERT_LT(prev.r, cur.r) << i;
        }
    }
    // The last stop given at each position wins there.
    EXPECT_EQ(GradEval(grad, 1.0).r, 58.0f);
}

TEST(Gradient, RepeatedPositionsMakeAHardEdge) {
    // Given out of order: the two stops at 0.5 keep their relative order.
    Gradient grad({GradStop(1, 1, 1, 1), GradStop(0.5, 1, 0, 0), GradStop(0, 0, 0, 0), GradStop(0.5, 0, 0, 1)});
    ASSERT_EQ(grad.Stops().size(), 4u);
    EXPECT_EQ(grad.Stops()[1].r, 1.0f); // red first, then blue
    EXPECT_EQ(grad.Stops()[2].b, 1.0f);
    ExpectGradSample(GradEval(grad, 0.25), 0.5, 0, 0, 1, 1e-7);    // black to red
    ExpectGradSample(GradEval(grad, 0.4999999), 1, 0, 0, 1, 1e-6); // red just before the edge
    ExpectGradSample(GradEval(grad, 0.5), 0, 0, 1, 1, 0);          // the later stop wins at the edge
    ExpectGradSample(GradEval(grad, 0.75), 0.5, 0.5, 1, 1, 1e-7);  // blue to white
    for (int space : {kGradHLS, kGradHSV, kGradLAB}) ExpectGradSample(GradEval(grad, 0.5, space), 0, 0, 1, 1, 0);

    // Repeated end positions: before the first gives the first; at the
    // shared position and past the end, the later one.
    Gradient ends({GradStop(0, 1, 0, 0), GradStop(0, 0, 1, 0), GradStop(1, 0, 0, 1), GradStop(1, 1, 1, 1)});
    ExpectGradSample(GradEval(ends, -1), 1, 0, 0, 1, 0);
    ExpectGradSample(GradEval(ends, 0), 0, 1, 0, 1, 0);
    ExpectGradSample(GradEval(ends, 0.5), 0, 0.5, 0.5, 1, 1e-7);
    ExpectGradSample(GradEval(ends, 1), 1, 1, 1, 1, 0);
    ExpectGradSample(GradEval(ends, 2), 1, 1, 1, 1, 0);

    // Three stops on one position: the last of them wins.
    Gradient triple({GradStop(0.5, 1, 0, 0), GradStop(0.5, 0, 1, 0), GradStop(0.5, 0, 0, 1)});
    ExpectGradSample(GradEval(triple, 0.4), 1, 0, 0, 1, 0);
    ExpectGradSample(GradEval(triple, 0.5), 0, 0, 1, 1, 0);
}

TEST(Gradient, HueTakesTheShorterWayRound) {
    // Full colours at hue 0.95 (1, 0, 0.3) and 0.05 (1, 0.3, 0). The short way
    // passes through red at hue 0; the long way would pass through cyan.
    Gradient grad({GradStop(0, 1, 0, 0.3f), GradStop(1, 1, 0.3f, 0)});
    for (int space : {kGradHSV, kGradHLS}) {
        SCOPED_TRACE(space);
        ExpectGradSample(GradEval(grad, 0.5, space), 1, 0, 0, 1, 1e-5);
        // Hue 0.975: six times it is 5.85, the last sector, 0.85 of the way.
        ExpectGradSample(GradEval(grad, 0.25, space), 1, 0, 0.15, 1, 1e-5);
        // Hue 0.025: the first sector, 0.15 of the way.
        ExpectGradSample(GradEval(grad, 0.75, space), 1, 0.15, 0, 1, 1e-5);
    }
    // Reversed, the blend comes back through red too.
    Gradient back({GradStop(0, 1, 0.3f, 0), GradStop(1, 1, 0, 0.3f)});
    ExpectGradSample(GradEval(back, 0.5, kGradHSV), 1, 0, 0, 1, 1e-5);
    // Exactly half a turn apart, the blend goes towards increasing hue: from
    // hue 0.25 (0.5, 1, 0) to 0.75 (0.5, 0, 1) through cyan at 0.5, and back
    // from 0.75 to 0.25 through red at 1.
    Gradient up({GradStop(0, 0.5f, 1, 0), GradStop(1, 0.5f, 0, 1)});
    Gradient down({GradStop(0, 0.5f, 0, 1), GradStop(1, 0.5f, 1, 0)});
    for (int space : {kGradHSV, kGradHLS}) {
        SCOPED_TRACE(space);
        ExpectGradSample(GradEval(up, 0.5, space), 0, 1, 1, 1, 1e-5);
        ExpectGradSample(GradEval(down, 0.5, space), 1, 0, 0, 1, 1e-5);
    }
    // In RGB the same stops blend channel by channel.
    ExpectGradSample(GradEval(grad, 0.5, kGradRGB), 1, 0.15, 0.15, 1, 1e-6);
}

TEST(Gradient, HueSpacesBlendHueAndSaturation) {
    // Red to green: hue 0 to 1/3 gives yellow at the middle, at full
    // saturation, where RGB gives a dark olive.
    Gradient grad({GradStop(0, 1, 0, 0), GradStop(1, 0, 1, 0)});
    ExpectGradSample(GradEval(grad, 0.5, kGradHSV), 1, 1, 0, 1, 1e-5);
    ExpectGradSample(GradEval(grad, 0.5, kGradHLS), 1, 1, 0, 1, 1e-5);
    ExpectGradSample(GradEval(grad, 0.5, kGradRGB), 0.5, 0.5, 0, 1, 1e-6);
}

TEST(Gradient, GreyEndTakesTheOtherHue) {
    // White to blue in HSV: white has no hue, so the blend keeps blue's hue 2/3
    // and halves the saturation: (2/3, 0.5, 1) is (0.5, 0.5, 1).
    Gradient grad({GradStop(0, 1, 1, 1), GradStop(1, 0, 0, 1)});
    ExpectGradSample(GradEval(grad, 0.5, kGradHSV), 0.5, 0.5, 1, 1, 1e-5);
    // The same in HLS: L 1 to 0.5 and S 0 to 1 give L 0.75, S 0.5 at hue 2/3;
    // chroma 0.5 * (1 - |2L - 1|) = 0.25 around 0.75, so (0.625, 0.625, 0.875).
    ExpectGradSample(GradEval(grad, 0.5, kGradHLS), 0.625, 0.625, 0.875, 1, 1e-5);
    // Black to red in HLS: lightness 0 to 0.5 and saturation 0 to 1 at hue 0;
    // the middle is L 0.25, S 0.5: chroma 0.25, so (0.375, 0.125, 0.125).
    Gradient dark({GradStop(0, 0, 0, 0), GradStop(1, 1, 0, 0)});
    ExpectGradSample(GradEval(dark, 0.5, kGradHLS), 0.375, 0.125, 0.125, 1, 1e-5);
}

TEST(Gradient, LabBlendsLightnessPerceptually) {
    // Black to white in L*a*b*: L* 50 at the middle, luminance ((50 + 16) / 116)^3.
    Gradient grad;
    double y = std::pow(66.0 / 116.0, 3.0);
    ExpectGradSample(GradEval(grad, 0.5, kGradLAB), y, y, y, 1, 1e-5);
    // Alpha stays linear whatever the colour space.
    Gradient alpha({GradStop(0, 1, 0, 0, 0), GradStop(1, 0, 0, 1, 1)});
    for (int space : {kGradRGB, kGradHLS, kGradHSV, kGradLAB}) EXPECT_NEAR(GradEval(alpha, 0.3, space).a, 0.3, 1e-6);
}

TEST(Gradient, UnknownSpaceBlendsInRGB) {
    Gradient grad({GradStop(0, 1, 0, 0), GradStop(1, 0, 1, 0)});
    ExpectGradSample(GradEval(grad, 0.5, 3), 0.5, 0.5, 0, 1, 1e-7);
    ExpectGradSample(GradEval(grad, 0.5, -1), 0.5, 0.5, 0, 1, 1e-7);
}

TEST(Gradient, EmptyAndSingleStop) {
    Gradient empty(std::vector<GradientStop>{});
    ExpectGradSample(GradEval(empty, 0.5), 0, 0, 0, 0, 0);
    EXPECT_FALSE(empty.IsOpaque());
    Gradient one({GradStop(0.3, 0.2f, 0.4f, 0.6f, 0.8f)});
    for (double p : {-1.0, 0.3, 0.31, 5.0}) ExpectGradSample(GradEval(one, p, kGradLAB), 0.2f, 0.4f, 0.6f, 0.8f, 0);
}

TEST(Gradient, IsOpaqueNeedsEveryAlphaAtLeastOne) {
    EXPECT_TRUE(Gradient({GradStop(0, 0, 0, 0, 1), GradStop(1, 1, 1, 1, 2)}).IsOpaque());
    EXPECT_FALSE(Gradient({GradStop(0, 0, 0, 0, 1), GradStop(1, 1, 1, 1, 0.999f)}).IsOpaque());
    EXPECT_FALSE(Gradient({GradStop(0, 0, 0, 0, 0), GradStop(1, 1, 1, 1, 1)}).IsOpaque());
}

TEST(Gradient, EqualsHashAndCopy) {
    Gradient a({GradStop(0, 0.1f, 0.2f, 0.3f), GradStop(0.5, 1, 0, 0), GradStop(0.5, 0, 0, 1)});
    Gradient b({GradStop(0, 0.1f, 0.2f, 0.3f), GradStop(0.5, 1, 0, 0), GradStop(0.5, 0, 0, 1)});
    EXPECT_TRUE(a.Equals(b));
    EXPECT_EQ(a.Hash(), b.Hash());

    Gradient swapped({GradStop(0, 0.1f, 0.2f, 0.3f), GradStop(0.5, 0, 0, 1), GradStop(0.5, 1, 0, 0)});
    EXPECT_FALSE(a.Equals(swapped)); // order at a shared position matters
    Gradient moved({GradStop(0, 0.1f, 0.2f, 0.3f), GradStop(0.5, 1, 0, 0), GradStop(0.6, 0, 0, 1)});
    EXPECT_FALSE(a.Equals(moved));
    Gradient shorter({GradStop(0, 0.1f, 0.2f, 0.3f), GradStop(0.5, 1, 0, 0)});
    EXPECT_FALSE(a.Equals(shorter));
    EXPECT_FALSE(shorter.Equals(a));
    Gradient alpha({GradStop(0, 0.1f, 0.2f, 0.3f), GradStop(0.5, 1, 0, 0), GradStop(0.5, 0, 0, 1, 0.5f)});
    EXPECT_FALSE(a.Equals(alpha));
    EXPECT_NE(a.Hash(), alpha.Hash());
    EXPECT_FALSE(a.Equals(Number(0.5)));

    Ref<Parameter> copy = a.Copy();
    ASSERT_TRUE(copy);
    EXPECT_NE(copy.Get(), static_cast<Parameter *>(&a));
    EXPECT_TRUE(copy->Equals(a));
    EXPECT_EQ(copy->Hash(), a.Hash());
    EXPECT_EQ(copy->DataType(), CLSID_DataType_Gradient);
}

TEST(Gradient, InterpolateBlendsStopsWithMatchingPositions) {
    Ref<Gradient> from = MakeRef<Gradient>(std::vector<GradientStop>{GradStop(0, 0, 0, 0, 1), GradStop(1, 1, 1, 1, 1)});
    Ref<Gradient> to = MakeRef<Gradient>(std::vector<GradientStop>{GradStop(0, 1, 0, 0, 0), GradStop(1, 0, 0, 1, 1)});
    Ref<Parameter> mid = from->Interpolate(*to, 0.25);
    auto *g = dynamic_cast<Gradient *>(mid.Get());
    ASSERT_NE(g, nullptr);
    ASSERT_EQ(g->Stops().size(), 2u);
    ExpectGradSample(GradEval(*g, 0), 0.25, 0, 0, 0.75, 1e-7);
    ExpectGradSample(GradEval(*g, 1), 0.75, 0.75, 1, 1, 1e-7);
    EXPECT_TRUE(from->Interpolate(*to, 0.0)->Equals(*from));
    EXPECT_TRUE(from->Interpolate(*to, 1.0)->Equals(*to));
}

TEST(Gradient, InterpolateOtherwiseTakesTheNearer) {
    Ref<Gradient> from = MakeRef<Gradient>();
    Ref<Gradient> moved = MakeRef<Gradient>(std::vector<GradientStop>{GradStop(0, 1, 0, 0), GradStop(0.5, 0, 0, 1)});
    Ref<Gradient> more = MakeRef<Gradient>(
        std::vector<GradientStop>{GradStop(0, 1, 0, 0), GradStop(0.5, 0, 1, 0), GradStop(1, 0, 0, 1)});
    EXPECT_EQ(from->Interpolate(*moved, 0.3).Get(), static_cast<Parameter *>(from.Get()));
    EXPECT_EQ(from->Interpolate(*moved, 0.7).Get(), static_cast<Parameter *>(moved.Get()));
    EXPECT_EQ(from->Interpolate(*more, 0.7).Get(), static_cast<Parameter *>(more.Get()));
    Number n(3.0);
    EXPECT_EQ(from->Interpolate(n, 0.2).Get(), static_cast<Parameter *>(from.Get()));
}

TEST(Gradient, ScriptFormOfTheDefault) {
    ScriptVal colors = ScriptVal::Table();
    colors.Set(ScriptVal(0.0), GradColor(0, 0, 0, 1));
    colors.Set(ScriptVal(1.0), GradColor(1, 1, 1, 1));
    EXPECT_EQ(Gradient().ToScript(), GradDoc(colors));

    Ref<Gradient> read = Gradient::FromScript(
        ScriptVal::FromText("Gradient { Colors = { [0] = { 0, 0, 0, 1 }, [1] = { 1, 1, 1, 1 } } }"));
    ASSERT_TRUE(read);
    EXPECT_TRUE(read->Equals(Gradient()));
}

TEST(Gradient, ScriptRoundTrip) {
    Gradient grad({GradStop(-0.25, 0.1f, 0.2f, 0.3f, 0.4f), GradStop(0.5, 1, 0, 0), GradStop(0.5, 0, 0, 1, 0.75f),
                   GradStop(0.3333333333333333, 1.0f / 3, 2.5f, -0.125f, 1), GradStop(2, 0, 0, 0, 0)});
    ScriptVal doc = grad.ToScript();
    EXPECT_EQ(doc.ClassName(), "Gradient");
    // The shared position is one key holding both colours in order.
    const ScriptVal *edge = doc.Find(std::string_view("Colors"))->Find(ScriptVal(0.5));
    ASSERT_NE(edge, nullptr);
    EXPECT_EQ(edge->ArrayLength(), 2u);
    // Float colours are written as their shortest decimal.
    const ScriptVal *first = doc.Find(std::string_view("Colors"))->Find(ScriptVal(-0.25));
    ASSERT_NE(first, nullptr);
    EXPECT_EQ(first->At(1)->AsNumber(), 0.1);

    Ref<Gradient> back = Gradient::FromScript(doc);
    ASSERT_TRUE(back);
    EXPECT_TRUE(back->Equals(grad));
    Ref<Gradient> viaText = Gradient::FromScript(ScriptVal::FromText(doc.ToText()));
    ASSERT_TRUE(viaText);
    EXPECT_TRUE(viaText->Equals(grad));
    EXPECT_EQ(viaText->Hash(), grad.Hash());
}

TEST(Gradient, ScriptReadingIsLenientWhereHarmless) {
    // Three components mean opaque; a plain table and extra entries are fine.
    Ref<Gradient> g = Gradient::FromScript(
        ScriptVal::FromText("{ Version = 2, Colors = { [1] = { 1, 0, 0 }, [0] = { 0, 1, 0, 0.5 } } }"));
    ASSERT_TRUE(g);
    ASSERT_EQ(g->Stops().size(), 2u);
    ExpectGradStop(GradEval(*g, 0), GradStop(0, 0, 1, 0, 0.5f));
    ExpectGradStop(GradEval(*g, 1), GradStop(1, 1, 0, 0, 1));
    // No stops at all reads as an empty gradient.
    Ref<Gradient> empty = Gradient::FromScript(ScriptVal::FromText("Gradient { Colors = {} }"));
    ASSERT_TRUE(empty);
    EXPECT_TRUE(empty->Stops().empty());
}

TEST(Gradient, MalformedScriptIsRejected) {
    const char *bad[] = {
        "1",
        "\"Gradient\"",
        "Gradient {}",
        "Gradient { Colors = 3 }",
        "Curve { Colors = { [0] = { 0, 0, 0, 1 } } }",
        "Gradient { Colors = Table { [0] = { 0, 0, 0, 1 } } }",
        "Gradient { Colors = { Red = { 1, 0, 0, 1 } } }",
        "Gradient { Colors = { [1/0] = { 1, 0, 0, 1 } } }",
        "Gradient { Colors = { [-1/0] = { 1, 0, 0, 1 } } }",
        "Gradient { Colors = { [0] = 1 } }",
        "Gradient { Colors = { [0] = { 1, 0 } } }",
        "Gradient { Colors = { [0] = { 1, 0, 0, 1, 1 } } }",
        "Gradient { Colors = { [0] = { 1, 0, \"blue\", 1 } } }",
        "Gradient { Colors = { [0] = { r = 1, g = 0, b = 0 } } }",
        "Gradient { Colors = { [0] = { 1, 0, 0, 1, x = 2 } } }",
        "Gradient { Colors = { [0] = { { 1, 0, 0, 1 }, 5 } } }",
        "Gradient { Colors = { [0] = { { 1, 0, 0, 1 }, { 1, 0 } } } }",
    };
    for (const char *text : bad) {
        SCOPED_TRACE(text);
        EXPECT_FALSE(Gradient::FromScript(ScriptVal::FromText(text)));
    }
    EXPECT_FALSE(Gradient::FromScript(ScriptVal()));
}
