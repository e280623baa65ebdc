#include <cstdlib>
#include <filesystem>

#include "host/color/ColorConfig.h"
#include "host/flow/InputValue.h"
#include "host/media/Clip.h"
#include "tests/operators/color/ColorTestSupport.h"

namespace Orvane::colortest::managed {

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

using Function = std::function<Rgb(const Rgb &)>;

double Clamp01(double v) { return std::clamp(v, 0.0, 1.0); }
// Tables clamp their input to the domain 0..1 they are written over.
Rgb Invert(const Rgb &c) { return {1 - Clamp01(c[0]), 1 - Clamp01(c[1]), 1 - Clamp01(c[2])}; }
Rgb Rotate(const Rgb &c) { return {Clamp01(c[2]), Clamp01(c[0]), Clamp01(c[1])}; }
Rgb Products(const Rgb &c) { return {c[0] * c[1], c[1] * c[2], c[2] * c[0]}; }

/// A .cube 3D table of `n` points a side (red fastest), or an .spi3d table (`spi`, each line with its indices).
std::string Table3D(const Function &f, int n, bool spi = false) {
    std::string t = spi ? "SPILUT 1.0\n3 3\n2 2 2\n" : "LUT_3D_SIZE " + std::to_string(n) + "\n";
    for (int i = 0; i < n * n * n; ++i) {
        const int r = spi ? i / (n * n) : i % n, g = i / n % n, b = spi ? i % n : i / (n * n);
        const Rgb o = f({r / (n - 1.0), g / (n - 1.0), b / (n - 1.0)});
        if (spi) t += std::to_string(r) + " " + std::to_string(g) + " " + std::to_string(b) + " ";
        t += std::to_string(o[0]) + " " + std::to_string(o[1]) + " " + std::to_string(o[2]) + "\n";
    }
    return t;
}

const char *const kInvertSpi1D = "Version 1\nFrom 0.0 1.0\nLength 2\nComponents 1\n{\n 1.0\n 0.0\n}\n";

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
        auto set = [from = from, to = to](Operator *op) {
            T::SetText(op, "FromSpace", from), T::SetText(op, "ToSpace", to);
        };
        auto model = [f = f](const Image &, const Px &p) { return Px{f(p[0]), f(p[1]), f(p[2]), p[3]}; };
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

TEST_F(ColorSpaceTransformTest, WhereConfigurationsAndTablesComeFromAndWhatCannotBeRead) {
    // A configuration of our own: its space "squared" is the square of its reference.
    Write("own.ocio", "ocio_profile_version: 2\nroles: {default: ref}\ncolorspaces:\n"
                      "  - !<ColorSpace> {name: ref}\n"
                      "  - !<ColorSpace>\n    name: squared\n"
                      "    from_scene_reference: !<ExponentTransform> {value: 2}\n");
    Write("invert.cube", Table3D(Invert, 2)), Write("broken.cube", "LUT_3D_SIZE 2\n0 0 0\n1 1\n");
    Write("unknown.xyz", "0 1\n");
    const char *cst = "ColorSpaceTransform";
    auto lut = [&](const char *name) { return Texts{{"LUTFile", dir / name}}; };
    const std::tuple<const char *, const char *, const char *, Texts, double, std::string> cases[] = {
        // preference, environment, tool, its inputs: the grey 0.25 made `want`, or the console line
        {"own.ocio", nullptr, cst, Spaces("ref", "squared"), 0.0625, ""},
        {nullptr, "own.ocio", cst, Spaces("ref", "squared"), 0.0625, ""},
        {nullptr, nullptr, cst, Spaces("ref", "squared"), 0, "no colour space 'ref' in the configuration built-in"},
        {nullptr, nullptr, cst, Spaces("sRGB", ""), 0, "no colour space '' in the configuration built-in"},
        {"missing.ocio", nullptr, cst, Spaces("sRGB", "linear"), 0,
         "cannot read colour configuration '" + dir / "missing.ocio" + "'"},
        {nullptr, nullptr, "FileLUT", {}, 0.25, ""},                           // no file named yet
        {nullptr, nullptr, "FileLUT", {{"LUTFile", "invert.cube"}}, 0.75, ""}, // in the document's folder
        {nullptr, nullptr, "FileLUT", lut("missing.cube"), 0, "cannot read LUT file '" + dir / "missing.cube" + "'"},
        {nullptr, nullptr, "FileLUT", lut("broken.cube"), 0, "cannot read LUT file '" + dir / "broken.cube" + "'"},
        {nullptr, nullptr, "FileLUT", lut("unknown.xyz"), 0, "cannot read LUT file '" + dir / "unknown.xyz" + "'"},
    };
    for (const auto &[pref, env, cls, texts, want, line] : cases) {
        SCOPED_TRACE(std::string(cls) + " " + line);
        Chain chain(ColourRow({{0.25, 0.25, 0.25}}));
        chain.doc.SetFilePath(dir / "flow.orvane");
        if (pref) chain.doc.SetColorConfigPath(pref);
        if (env) setenv("OCIO", (dir / env).c_str(), 1);
        Operator *tool = chain.Add(cls, texts);
        Ref<Image> out = chain.Run();
        unsetenv("OCIO");
        if (line.empty())
            ExpectColoursNear(out, {{want, want, want}}, 1e-5);
        else
            ExpectFailure(out, chain.doc, tool->Name() + ": " + line);
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

class FileLUTTest : public ToolTest {};

TEST_F(FileLUTTest, ExactFunctionsAtEveryDepth) {
    const std::tuple<const char *, std::string, Function> cases[] = {
        {"invert.cube", Table3D(Invert, 2), Invert},
        {"rotate.cube", Table3D(Rotate, 5), Rotate},
        {"invert1d.cube", "LUT_1D_SIZE 2\n1 1 1\n0 0 0\n", Invert},
        {"invert.spi1d", kInvertSpi1D, Invert},
        {"rotate.spi3d", Table3D(Rotate, 2, true), Rotate},
    };
    for (const auto &[name, text, f] : cases) {
        const std::string file = Write(name, text);
        for (int depth : {DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
            SCOPED_TRACE(std::string(name) + " depth " + std::to_string(depth));
            Ref<Image> src = T::PatternImage(23, 7, depth, 3);
            Chain chain(src);
            chain.Add("FileLUT", {{"LUTFile", file}});
            Ref<Image> out = chain.Run();
            ASSERT_TRUE(out && out->Depth() == depth);
            // The function's value stored at the depth (integers and halves round once); alpha passes.
            Ref<Image> want = T::PatternImage(23, 7, depth, 3);
            for (int y = 0; y < 7; ++y)
                for (int x = 0; x < 23; ++x) {
                    const FltPixel in = src->GetFlt(x, y);
                    const Rgb w = f({in.R, in.G, in.B});
                    want->PutFlt(x, y, {float(w[0]), float(w[1]), float(w[2]), in.A});
                }
            EXPECT_LE(WorstDifference(*out, *want, want->DataWindow(), 4), depth == DepthRGBAFlt32 ? 1e-6 : 0.0);
        }
    }
}

TEST_F(FileLUTTest, InterpolationAndDirection) {
    const std::string spi1d = Write("invert.spi1d", kInvertSpi1D), rotate = Write("rotate.cube", Table3D(Rotate, 9)),
                      products = Write("products.cube", Table3D(Products, 2));
    const std::tuple<std::string, int, bool, std::vector<Rgb>, double> cases[] = {
        // Products of channels from their values at the cube's corners: trilinear reading gives the products
        // themselves; tetrahedral weighs the four corners along the path of the sorted coordinates (for 0.3,
        // 0.7, 0: 000, 010, 110, 111 with weights 0.3, 0.4, 0.3, 0).
        {products, 1, false, {{0.21, 0, 0}, {0.055, 0.495, 0.09}}, 1e-6},
        {products, 2, false, {{0.3, 0, 0}, {0.1, 0.55, 0.1}}, 1e-6},
        // Inverting 1 - x gives 1 - x again; the inverse of the rotation is found by search.
        {spi1d, 1, true, {{0.7, 0.3, 1}, {0.9, 0.45, 0.1}}, 1e-5},
        {rotate, 1, true, {{0.7, 0.0, 0.3}, {0.55, 0.9, 0.1}}, 1e-3},
    };
    for (const auto &[file, interpolation, inverse, want, tol] : cases) {
        SCOPED_TRACE(file + " " + std::to_string(interpolation) + (inverse ? " inverse" : ""));
        Chain chain(ColourRow({{0.3, 0.7, 0.0}, {0.1, 0.55, 0.9}}));
        chain.Add("FileLUT", {{"LUTFile", file}}, {{"Interpolation", interpolation}, {"Direction", inverse}});
        ExpectColoursNear(chain.Run(), want, tol);
    }
}

TEST_F(FileLUTTest, BothToolsAgreeWithOiiotool) {
    if (!T::HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    // A smooth table with cross-talk between the channels, 17 points a side. oiiotool reads a table only with a
    // configuration at hand; ours serves.
    const std::string config = Write("builtin.ocio", ColorConfig::BuiltInText());
    const std::string cube = Write(
        "look.cube",
        Table3D(
            [](const Rgb &c) {
                return Rgb{std::pow(c[0], 0.8) * 0.9 + 0.1 * c[1], 0.2 * c[0] + 0.8 * std::sqrt(c[1]), c[2] * c[2]};
            },
            17));
    const std::tuple<const char *, Texts, std::string> cases[] = {
        {"ColorSpaceTransform", Spaces("sRGB", "Linear Rec.2020"), "--colorconvert sRGB \"Linear Rec.2020\""},
        {"FileLUT", {{"LUTFile", cube}}, "--ociofiletransform " + cube}};
    Ref<Image> src = T::PatternImage(32, 16, DepthRGBAFlt32, 9);
    for (const auto &[cls, texts, args] : cases) {
        Ref<Image> theirs = ThroughOiiotool(*src, dir.path, "--colorconfig " + config + " " + args);
        Chain chain(src);
        chain.Add(cls, texts);
        Ref<Image> ours = chain.Run();
        ASSERT_TRUE(theirs && ours) << cls;
        EXPECT_LT(WorstDifference(*ours, *theirs, ours->DataWindow()), 1e-5) << cls;
    }
}

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
        auto set = [from = from, to = to](Operator *op) { T::SetNumbers(op, Convert(from, Linear, to, Linear)); };
        auto model = [m = m](const Image &, const Px &p) {
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
    ExpectColoursNear(Through({{0.02, 0.5, 1}}, {Convert(Rec709, SRGB, Rec709, Linear)}),
                      {{SrgbToLinear(0.02), SrgbToLinear(0.5), 1}}, 2e-5);
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

} // namespace Orvane::colortest::managed
