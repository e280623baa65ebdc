#include "host/flow/Gradient.h"

#include <cmath>
#include <limits>
#include <string_view>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "host/color/ColorSpace.h"
#include "host/flow/DataTypes.h"
#include "tests/support/TestSupport.h"

namespace Orvane::gradienttest {
namespace ts = ::Orvane::Test;
namespace {

constexpr int RGB = static_cast<int>(ColorSpaceType::RGB), HLS = static_cast<int>(ColorSpaceType::HLS);
constexpr int HSV = static_cast<int>(ColorSpaceType::HSV), LAB = static_cast<int>(ColorSpaceType::LAB);
constexpr int AllSpaces[] = {RGB, HLS, HSV, LAB};
constexpr double Inf = std::numeric_limits<double>::infinity();
using Stops = std::vector<GradientStop>;

FltPixel Sample(const Gradient &grad, double pos, int space = RGB) {
    FltPixel s;
    grad.QuickEvaluate(pos, s.R, s.G, s.B, s.A, space);
    return s;
}
FltPixel Color(const GradientStop &s) { return {s.r, s.g, s.b, s.a}; }

TEST(Gradient, BlendsAsItsColourSpaceDoesAndGivesTheStopColoursExactlyAtStopsAndEnds) {
    // Name, stops, colour spaces, positions, the colour expected there and its tolerance.
    const std::tuple<const char *, Stops, std::vector<int>, std::vector<double>, FltPixel, double> cases[] = {
        {"RGB", {{0.2, 1, 0, 0, 1}, {0.6, 0, 0.5, 1, 0}}, {RGB}, {0.3}, {0.75, 0.125, 0.25, 0.75}, 1e-6},
        {"RGB", {{0.2, 1, 0, 0, 1}, {0.6, 0, 0.5, 1, 0}}, {RGB}, {0.5}, {0.25, 0.375, 0.75, 0.25}, 1e-6},
        {"RGB, clear colour counts", {{0, 1, 0, 0, 0}, {1, 0, 0, 1, 1}}, {RGB}, {0.5}, {0.5, 0, 0.5, 0.5}, 1e-7},
        // Full colours at hue 0.95 and 0.05: the short way passes through red at hue 0; the long way would pass through
        // cyan.
        {"hue: the short way", {{0, 1, 0, 0.3}, {1, 1, 0.3, 0}}, {HSV, HLS}, {0.5}, {1, 0, 0, 1}, 1e-5},
        {"hue 0.975: last sector", {{0, 1, 0, 0.3}, {1, 1, 0.3, 0}}, {HSV, HLS}, {0.25}, {1, 0, 0.15, 1}, 1e-5},
        {"hue 0.025: first sector", {{0, 1, 0, 0.3}, {1, 1, 0.3, 0}}, {HSV, HLS}, {0.75}, {1, 0.15, 0, 1}, 1e-5},
        {"hue: the short way back", {{0, 1, 0.3, 0}, {1, 1, 0, 0.3}}, {HSV}, {0.5}, {1, 0, 0, 1}, 1e-5},
        // Half a turn apart, the blend goes towards increasing hue.
        {"half a turn up: cyan", {{0, 0.5, 1, 0}, {1, 0.5, 0, 1}}, {HSV, HLS}, {0.5}, {0, 1, 1, 1}, 1e-5},
        {"half a turn on: red", {{0, 0.5, 0, 1}, {1, 0.5, 1, 0}}, {HSV, HLS}, {0.5}, {1, 0, 0, 1}, 1e-5},
        {"red to green: yellow", {{0, 1, 0, 0}, {1, 0, 1, 0}}, {HSV, HLS}, {0.5}, {1, 1, 0, 1}, 1e-5},
        {"RGB: olive", {{0, 1, 0, 0}, {1, 0, 1, 0}}, {RGB, 3, -1}, {0.5}, {0.5, 0.5, 0, 1}, 1e-6},
        // A grey end has no hue: the blend keeps the other's. White to blue: HSV (2/3, 0.5, 1); HLS L 0.75, S 0.5,
        // chroma 0.25. Black to red in HLS: L 0.25, S 0.5.
        {"HSV: white to blue", {{0, 1, 1, 1}, {1, 0, 0, 1}}, {HSV}, {0.5}, {0.5, 0.5, 1, 1}, 1e-5},
        {"HLS: white to blue", {{0, 1, 1, 1}, {1, 0, 0, 1}}, {HLS}, {0.5}, {0.625, 0.625, 0.875, 1}, 1e-5},
        {"HLS: black to red", {{0, 0, 0, 0}, {1, 1, 0, 0}}, {HLS}, {0.5}, {0.375, 0.125, 0.125, 1}, 1e-5},
        {"no stops: clear", {}, {RGB, LAB}, {0.5}, {0, 0, 0, 0}, 0},
        {"one stop everywhere", {{0.3, 0.2, 0.4, 0.6, 0.8}}, {RGB, LAB}, {-1, 0.31, 5}, {0.2, 0.4, 0.6, 0.8}, 0},
    };
    for (const auto &[name, stops, spaces, positions, want, tol] : cases)
        for (int space : spaces)
            for (double pos : positions)
                ts::ExpectPixelNear(Sample(Gradient(stops), pos, space), want, tol,
                                    name + (" " + std::to_string(space)) + " " + std::to_string(pos));
    // Black to white in L*a*b*: L* 50 at the middle, luminance ((50 + 16) / 116)^3.
    const float y = static_cast<float>(std::pow(66.0 / 116.0, 3.0));
    ts::ExpectPixelNear(Sample(Gradient(), 0.5, LAB), {y, y, y, 1}, 1e-5, "Lab");
    ts::ExpectPixelNear(Sample(Gradient(), 0.25), {0.25, 0.25, 0.25, 1}, 1e-7, "default");
    // Alpha stays linear whatever the colour space.
    for (int space : AllSpaces)
        EXPECT_NEAR(Sample(Gradient(Stops{{0, 1, 0, 0, 0}, {1, 0, 0, 1, 1}}), 0.3, space).A, 0.3, 1e-6) << space;
    const Gradient grad({{0.2, 1, 0, 0, 0.5}, {0.6, 0, 0, 1, 1}});
    const Gradient many(
        {{0, 0.1, 0.2, 0.3, 0.4}, {0.3, 0.9, 0.05, 0.6, 1}, {0.8, 0.33, 0.77, 0.11, 0.5}, {1, 1.5, -0.2, 0.4, 1}});
    for (int space : AllSpaces) {
        SCOPED_TRACE(space);
        for (double p : {-5.0, 0.1, -Inf, std::nan("")}) EXPECT_EQ(Sample(grad, p, space), Color(grad.Stops()[0])) << p;
        for (double p : {0.7, 1e300, Inf}) EXPECT_EQ(Sample(grad, p, space), Color(grad.Stops()[1])) << p;
        for (const GradientStop &s : many.Stops()) {
            EXPECT_EQ(Sample(many, s.position, space), Color(s)) << s.position;
            // Continuous across each stop.
            for (double eps : {-1e-7, 1e-7})
                ts::ExpectPixelNear(Sample(many, s.position + eps, space), Color(s), 1e-5, std::to_string(eps));
        }
    }
}

TEST(Gradient, StopsAreSortedStablyAndRepeatedPositionsMakeHardEdges) {
    // Non-finite positions are dropped.
    const Gradient sorted({{1, 1, 1, 1}, {std::nan(""), 0.5, 0.5, 0.5}, {0, 0, 0, 0}, {Inf, 1, 0, 0}, {0.5, 0, 1, 0}});
    ASSERT_EQ(sorted.Stops().size(), 3u);
    for (int i = 0; i < 3; ++i) EXPECT_EQ(sorted.Stops()[i].position, 0.5 * i);
    ts::ExpectPixelNear(Sample(sorted, 0.25), {0, 0.5, 0, 1}, 1e-7);
    ts::ExpectPixelNear(Sample(sorted, 0.75), {0.5, 1, 0.5, 1}, 1e-7);
    // Enough stops that a sort which is not stable would reorder them: stop k sits at position k % 3 and carries k in
    // its red channel.
    Stops stops;
    for (int k = 0; k < 60; ++k) stops.push_back({static_cast<double>((59 - k) % 3), static_cast<float>(k), 0, 0});
    const Gradient stable(stops);
    ASSERT_EQ(stable.Stops().size(), 60u);
    for (size_t i = 1; i < 60; ++i) {
        const GradientStop &prev = stable.Stops()[i - 1], &cur = stable.Stops()[i];
        ASSERT_TRUE(prev.position < cur.position || (prev.position == cur.position && prev.r < cur.r)) << i;
    }
    EXPECT_EQ(Sample(stable, 1.0).R, 58.0f) << "the last stop given at a position wins there";
    // Given out of order, the two stops at 0.5 keep their order: red, then blue.
    const Gradient edge({{1, 1, 1, 1}, {0.5, 1, 0, 0}, {0, 0, 0, 0}, {0.5, 0, 0, 1}});
    const Gradient ends({{0, 1, 0, 0}, {0, 0, 1, 0}, {1, 0, 0, 1}, {1, 1, 1, 1}});
    const Gradient triple({{0.5, 1, 0, 0}, {0.5, 0, 1, 0}, {0.5, 0, 0, 1}});
    const std::tuple<const Gradient &, double, FltPixel, double> cases[] = {
        {edge, 0.25, {0.5, 0, 0, 1}, 1e-7},  {edge, 0.4999999, {1, 0, 0, 1}, 1e-6},
        {edge, 0.5, {0, 0, 1, 1}, 0},        {edge, 0.75, {0.5, 0.5, 1, 1}, 1e-7},
        {ends, -1, {1, 0, 0, 1}, 0},         {ends, 0, {0, 1, 0, 1}, 0},
        {ends, 0.5, {0, 0.5, 0.5, 1}, 1e-7}, {ends, 1, {1, 1, 1, 1}, 0},
        {ends, 2, {1, 1, 1, 1}, 0},          {triple, 0.4, {1, 0, 0, 1}, 0},
        {triple, 0.5, {0, 0, 1, 1}, 0},
    };
    for (const auto &[grad, pos, want, tol] : cases)
        ts::ExpectPixelNear(Sample(grad, pos), want, tol, std::to_string(pos));
    for (int space : AllSpaces) EXPECT_EQ(Sample(edge, 0.5, space), (FltPixel{0, 0, 1, 1})) << space;
}

TEST(Gradient, OpaqueEqualsHashCopyAndInterpolate) {
    EXPECT_TRUE(Gradient().IsOpaque() && Gradient({{0, 0, 0, 0, 1}, {1, 1, 1, 1, 2}}).IsOpaque());
    for (const Stops &clear :
         {Stops{{0, 0, 0, 0, 1}, {1, 1, 1, 1, 0.999}}, Stops{{0, 0, 0, 0, 0}, {1, 1, 1, 1, 1}}, Stops{}})
        EXPECT_FALSE(Gradient(clear).IsOpaque());
    const Stops stops{{0, 0.1, 0.2, 0.3}, {0.5, 1, 0, 0}, {0.5, 0, 0, 1}};
    const Gradient a(stops);
    EXPECT_TRUE(a.Equals(Gradient(stops)) && a.Hash() == Gradient(stops).Hash());
    const Stops others[] = {
        {{0, 0.1, 0.2, 0.3}, {0.5, 0, 0, 1}, {0.5, 1, 0, 0}}, // order at a shared position matters
        {{0, 0.1, 0.2, 0.3}, {0.5, 1, 0, 0}, {0.6, 0, 0, 1}},
        {{0, 0.1, 0.2, 0.3}, {0.5, 1, 0, 0}},
        {{0, 0.1, 0.2, 0.3}, {0.5, 1, 0, 0}, {0.5, 0, 0, 1, 0.5}},
    };
    for (const Stops &s : others)
        EXPECT_FALSE(a.Equals(Gradient(s)) || Gradient(s).Equals(a) || a.Hash() == Gradient(s).Hash());
    EXPECT_FALSE(a.Equals(Number(0.5)));
    Ref<Parameter> copy = a.Copy();
    EXPECT_TRUE(copy && copy.Get() != &a && copy->Equals(a) && copy->DataType() == CLSID_DataType_Gradient);
    Ref<Gradient> from = MakeRef<Gradient>(Stops{{0, 0, 0, 0, 1}, {1, 1, 1, 1, 1}});
    Ref<Gradient> to = MakeRef<Gradient>(Stops{{0, 1, 0, 0, 0}, {1, 0, 0, 1, 1}});
    Ref<Parameter> blend = from->Interpolate(*to, 0.25);
    auto *mid = dynamic_cast<Gradient *>(blend.Get());
    ASSERT_TRUE(mid && mid->Stops().size() == 2u);
    ts::ExpectPixelNear(Color(mid->Stops()[0]), {0.25, 0, 0, 0.75}, 1e-7);
    ts::ExpectPixelNear(Color(mid->Stops()[1]), {0.75, 0.75, 1, 1}, 1e-7);
    EXPECT_TRUE(from->Interpolate(*to, 0.0)->Equals(*from) && from->Interpolate(*to, 1.0)->Equals(*to));
    // Stops that do not match: the nearer gradient, whole.
    Ref<Gradient> moved = MakeRef<Gradient>(Stops{{0, 1, 0, 0}, {0.5, 0, 0, 1}});
    Ref<Gradient> more = MakeRef<Gradient>(Stops{{0, 1, 0, 0}, {0.5, 0, 1, 0}, {1, 0, 0, 1}});
    EXPECT_EQ(from->Interpolate(*moved, 0.3).Get(), static_cast<Parameter *>(from.Get()));
    EXPECT_EQ(from->Interpolate(*moved, 0.7).Get(), static_cast<Parameter *>(moved.Get()));
    EXPECT_EQ(from->Interpolate(*more, 0.7).Get(), static_cast<Parameter *>(more.Get()));
    EXPECT_EQ(from->Interpolate(Number(3.0), 0.2).Get(), static_cast<Parameter *>(from.Get()));
}

TEST(Gradient, ScriptFormRoundTripsAndReadingIsLenientWhereHarmlessAndRefusesTheMalformed) {
    const char *defaultText = "Gradient { Colors = { [0] = { 0, 0, 0, 1 }, [1] = { 1, 1, 1, 1 } } }";
    EXPECT_EQ(Gradient().ToScript(), ScriptVal::FromText(defaultText));
    Ref<Gradient> read = Gradient::FromScript(ScriptVal::FromText(defaultText));
    EXPECT_TRUE(read && read->Equals(Gradient()));
    const Gradient grad({{-0.25, 0.1, 0.2, 0.3, 0.4},
                         {0.5, 1, 0, 0},
                         {0.5, 0, 0, 1, 0.75},
                         {0.3333333333333333, 1.0f / 3, 2.5, -0.125, 1},
                         {2, 0, 0, 0, 0}});
    const ScriptVal doc = grad.ToScript();
    EXPECT_EQ(doc.ClassName(), "Gradient");
    // The shared position is one key holding both colours in order.
    const ScriptVal *edge = doc.Find(std::string_view("Colors"))->Find(ScriptVal(0.5));
    EXPECT_TRUE(edge && edge->ArrayLength() == 2u);
    // Float colours are written as their shortest decimal.
    const ScriptVal *first = doc.Find(std::string_view("Colors"))->Find(ScriptVal(-0.25));
    EXPECT_TRUE(first && first->At(1)->AsNumber() == 0.1);
    for (const ScriptVal &form : {doc, ScriptVal::FromText(doc.ToText())}) {
        Ref<Gradient> back = Gradient::FromScript(form);
        EXPECT_TRUE(back && back->Equals(grad) && back->Hash() == grad.Hash());
    }
    // Three components mean opaque; a plain table and extra entries are fine.
    Ref<Gradient> g = Gradient::FromScript(
        ScriptVal::FromText("{ Version = 2, Colors = { [1] = { 1, 0, 0 }, [0] = { 0, 1, 0, 0.5 } } }"));
    EXPECT_TRUE(g && g->Equals(Gradient({{0, 0, 1, 0, 0.5}, {1, 1, 0, 0, 1}})));
    Ref<Gradient> empty = Gradient::FromScript(ScriptVal::FromText("Gradient { Colors = {} }"));
    EXPECT_TRUE(empty && empty->Stops().empty());
    // Not a table; no colours or no table of them; another class; keys that are no finite position; colours of the
    // wrong size, type or shape.
    for (const char *text :
         {"1", "\"Gradient\"", "Gradient {}", "Gradient { Colors = 3 }", "Curve { Colors = { [0] = { 0, 0, 0, 1 } } }",
          "Gradient { Colors = Table { [0] = { 0, 0, 0, 1 } } }"})
        EXPECT_FALSE(Gradient::FromScript(ScriptVal::FromText(text))) << text;
    for (const char *colors :
         {"Red = { 1, 0, 0, 1 }", "[1/0] = { 1, 0, 0, 1 }", "[-1/0] = { 1, 0, 0, 1 }", "[0] = 1", "[0] = { 1, 0 }",
          "[0] = { 1, 0, 0, 1, 1 }", "[0] = { 1, 0, \"blue\", 1 }", "[0] = { r = 1, g = 0, b = 0 }",
          "[0] = { 1, 0, 0, 1, x = 2 }", "[0] = { { 1, 0, 0, 1 }, 5 }", "[0] = { { 1, 0, 0, 1 }, { 1, 0 } }"})
        EXPECT_FALSE(Gradient::FromScript(ScriptVal::FromText("Gradient { Colors = { " + std::string(colors) + " } }")))
            << colors;
    EXPECT_FALSE(Gradient::FromScript(ScriptVal()));
}

} // namespace
} // namespace Orvane::gradienttest
