#include <cstdlib>
#include <filesystem>

#include "host/color/ColorConfig.h"
#include "host/flow/InputValue.h"
#include "host/media/Clip.h"
#include "tests/operators/color/ColorTestSupport.h"

namespace Orvane::colortest::cst {

// The sRGB curve with its toe where the power's tangent passes through black (slope 12.923, rounded to 12.92 where
// it is published).
constexpr double kA = 0.055, kG = 2.4, kBreak = kA / (kG - 1);
const double kSlope = kBreak / std::pow((kBreak + kA) / (1 + kA), kG);
double SrgbToLinear(double v) { return v <= kBreak ? v / kSlope : std::pow((v + kA) / (1 + kA), kG); }
double LinearToSrgb(double v) { return v <= kBreak / kSlope ? v * kSlope : (1 + kA) * std::pow(v, 1 / kG) - kA; }
/// Printing density with black at code 95 and white at 685 (0.002 density a code, film gamma 0.6).
double CineonToLinear(double v) {
    const double black = std::pow(10.0, (95.0 - 685.0) / 300.0);
    return (std::pow(10.0, (v * 1023.0 - 685.0) / 300.0) - black) / (1 - black);
}

std::vector<Rgb> Greys(double (*f)(double) = [](double v) { return v; }) {
    std::vector<Rgb> out;
    for (double v : {0.0, 0.002, 0.04045, 0.1, 0.18, 0.5, 0.8, 1.0, 1.5}) out.push_back({f(v), f(v), f(v)});
    return out;
}

Texts Spaces(const std::string &from, const std::string &to) { return {{"FromSpace", from}, {"ToSpace", to}}; }

class ColorSpaceTransformTest : public ToolTest {
protected:
    void SetUp() override { unsetenv("OCIO"); }
    void TearDown() override { unsetenv("OCIO"); }
    /// Sets inputs as a document does.
    static void Set(OrvaneDoc &doc, Operator *op, const std::vector<std::pair<const char *, ScriptVal>> &values) {
        for (const auto &[id, value] : values) ASSERT_EQ(ApplyInputValue(doc, op->FindInput(id), value), "") << id;
    }
};

TEST_F(ColorSpaceTransformTest, CurvesByNameRoleAndAliasKeepTheFrameRules) {
    // The tolerance covers the fast powers of the optimised transform.
    const std::tuple<const char *, const char *, double (*)(double)> cases[] = {
        {"sRGB", "Linear Rec.709", SrgbToLinear},
        {"srgb_texture", "scene_linear", SrgbToLinear},
        {"lin_rec709", "sRGB", LinearToSrgb},
        {"cineon", "linear", CineonToLinear}};
    for (const auto &[from, to, f] : cases) {
        SCOPED_TRACE(std::string(from) + " -> " + to);
        auto set = [&](Operator *op) { T::SetText(op, "FromSpace", from), T::SetText(op, "ToSpace", to); };
        auto model = [&](const Image &, const Px &p) { return Px{f(p[0]), f(p[1]), f(p[2]), p[3]}; };
        ExpectFrameRules("ColorSpaceTransform", set, model, 2e-5, {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16},
                         false); // it renders whole windows
    }
}

TEST_F(ColorSpaceTransformTest, FloatRoundTrips) {
    // To linear and back through each encoding, from black up (below black the curves leave their use).
    const std::vector<Rgb> colours = {{0, 0.002, 0.04}, {0.18, 0.5, 0.8}, {1, 1.2, 1.5}};
    for (const char *space : {"sRGB", "Rec.709", "Cineon Log", "Linear Rec.2020"}) {
        Chain chain(ColourRow(colours));
        chain.Add("ColorSpaceTransform", Spaces(space, "scene_linear"));
        chain.Add("ColorSpaceTransform", Spaces("scene_linear", space));
        ExpectColoursNear(chain.Run(), colours, 1e-4);
    }
}

TEST_F(ColorSpaceTransformTest, ConfigurationSourcesAndFailures) {
    // A configuration of our own: its space "squared" is the square of its reference.
    Write("own.ocio", "ocio_profile_version: 2\nroles: {default: ref}\ncolorspaces:\n"
                      "  - !<ColorSpace> {name: ref}\n"
                      "  - !<ColorSpace>\n    name: squared\n"
                      "    from_scene_reference: !<ExponentTransform> {value: 2}\n");
    const std::tuple<const char *, const char *, const char *, const char *, std::string> cases[] = {
        // preference, environment, from, to: 0.5 squared, or the console line
        {"own.ocio", nullptr, "ref", "squared", ""},
        {nullptr, "own.ocio", "ref", "squared", ""},
        {nullptr, nullptr, "ref", "squared", "no colour space 'ref' in the configuration built-in"},
        {nullptr, nullptr, "sRGB", "", "no colour space '' in the configuration built-in"},
        {"missing.ocio", nullptr, "sRGB", "linear", "cannot read colour configuration '" + dir / "missing.ocio" + "'"},
    };
    for (const auto &[pref, env, from, to, line] : cases) {
        SCOPED_TRACE(line);
        Chain chain(ColourRow({{0.5, 0.5, 0.5}}));
        chain.doc.SetFilePath(dir / "flow.orvane");
        if (pref) chain.doc.SetColorConfigPath(pref);
        if (env) setenv("OCIO", (dir / env).c_str(), 1);
        Operator *cst = chain.Add("ColorSpaceTransform", Spaces(from, to));
        Ref<Image> out = chain.Run();
        unsetenv("OCIO");
        if (line.empty())
            ExpectColoursNear(out, {{0.25, 0.25, 0.25}}, 1e-5);
        else
            ExpectFailure(out, chain.doc, cst->Name() + ": " + line);
    }
}

TEST_F(ColorSpaceTransformTest, LoaderAndSaverNameConfigurationSpaces) {
    // A float file of sRGB-encoded greys; the Loader takes them to scene_linear, or fails naming the space.
    const std::string file = dir / "greys.raw";
    std::string error;
    ASSERT_TRUE(Clip(file).PutFrameTagList(0, ColourRow(Greys()).Get(), {}, error)) << error;
    for (const char *space : {"srgb_texture", "Nowhere"}) {
        OrvaneDoc doc;
        Operator *loader = doc.AddTool(OvID("Loader"), "Plate");
        Set(doc, loader, {{"Clip", file}, {"GamutSpace", "ColorSpace"}, {"GamutColorSpace", space}});
        Ref<Image> out = T::EvalImage(loader);
        if (std::string(space) == "srgb_texture")
            ExpectColoursNear(out, Greys(SrgbToLinear), 1e-4);
        else
            ExpectFailure(out, doc, "Plate: no colour space 'Nowhere' in the configuration built-in");
    }
    // The Saver writes linear greys encoded for the role color_picking (sRGB).
    Chain chain(ColourRow(Greys()));
    Operator *saver = chain.doc.AddTool(OvID("Saver"), "Out");
    ASSERT_TRUE(saver->FindInput("Input")->ConnectTo(chain.last->FindMainOutput()));
    std::filesystem::create_directory(dir / "out");
    Set(chain.doc, saver,
        {{"Clip", dir / "out/greys.0000.raw"}, {"GamutSpace", "ColorSpace"}, {"GamutColorSpace", "color_picking"}});
    RenderTask task;
    EvalOptions opt;
    opt.task = &task;
    ASSERT_TRUE(Evaluate(saver->FindMainOutput(), 0.0, opt)) << T::ConsoleText(chain.doc);
    const auto written = std::filesystem::directory_iterator(dir / "out")->path().string();
    ExpectColoursNear(Clip(written).GetFrameTagList(0, {}, error), Greys(LinearToSrgb), 2e-5);
}

TEST_F(ColorSpaceTransformTest, SameAsOiiotool) {
    if (!T::HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    const std::string config = Write("builtin.ocio", ColorConfig::BuiltInText());
    Ref<Image> src = T::PatternImage(24, 12, DepthRGBAFlt32, 4);
    Ref<Image> theirs =
        ThroughOiiotool(*src, dir.path, "--colorconfig " + config + " --colorconvert sRGB \"Linear Rec.2020\"");
    ASSERT_TRUE(theirs);
    Chain chain(src);
    chain.Add("ColorSpaceTransform", Spaces("sRGB", "Linear Rec.2020"));
    Ref<Image> ours = chain.Run();
    ASSERT_TRUE(ours);
    EXPECT_LT(WorstDifference(*ours, *theirs, ours->DataWindow()), 1e-5);
}

} // namespace Orvane::colortest::cst
