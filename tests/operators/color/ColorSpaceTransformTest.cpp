// ColorSpaceTransform: known values from the curves' formulas, a round trip, where the configuration comes from,
// spaces and configurations that cannot be found, and oiiotool converting with the same configuration.
#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/color/ColorConfig.h"
#include "host/flow/Engine.h"
#include "host/flow/InputValue.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/image/NewImage.h"
#include "host/media/Clip.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::cst_test {
namespace {
namespace T = Orvane::Test;

double SrgbToLinear(double v) { return v <= 0.04045 ? v / 12.92 : std::pow((v + 0.055) / 1.055, 2.4); }
double LinearToSrgb(double v) { return v <= 0.0031308 ? v * 12.92 : 1.055 * std::pow(v, 1 / 2.4) - 0.055; }
/// Printing density with black at code 95 and white at 685 (0.002 density a code, film gamma 0.6).
double CineonToLinear(double v) {
    const double black = std::pow(10.0, (95.0 - 685.0) / 300.0);
    return (std::pow(10.0, (v * 1023.0 - 685.0) / 300.0) - black) / (1 - black);
}

const std::vector<double> kValues = {0.0, 0.002, 0.04045, 0.1, 0.18, 0.5, 0.8, 1.0, 1.5};

/// One row of float pixels: grey values (alpha 0.25).
Ref<Image> Greys(const std::vector<double> &values) {
    Ref<Image> img =
        NewImageTagList({{ImgWidth, static_cast<int>(values.size())}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    for (size_t x = 0; x < values.size(); ++x) {
        const auto v = static_cast<float>(values[x]);
        img->PutFlt(static_cast<int>(x), 0, {v, v, v, 0.25f});
    }
    return img;
}

struct Rig {
    OrvaneDoc doc;
    Test::ImageSourceTool *source;
    Operator *last;
    explicit Rig(Ref<Image> img) : source(Test::AddImageSource(doc, "Src", std::move(img))), last(source) {}
    /// A transform after the last tool.
    Operator *Add(const std::string &from, const std::string &to) {
        Operator *cst = doc.AddTool(OvID("ColorSpaceTransform"));
        EXPECT_TRUE(cst && cst->FindInput("Input")->ConnectTo(last->FindMainOutput()));
        Test::SetText(cst, "FromSpace", from);
        Test::SetText(cst, "ToSpace", to);
        return last = cst;
    }
    Ref<Image> Run() {
        EvalOptions opt;
        opt.useCache = false;
        return Test::EvalImage(last, 0.0, opt);
    }
};

class ColorSpaceTransformTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { T::LoadOperators(); }
    void SetUp() override { unsetenv("OCIO"); }
    void TearDown() override { unsetenv("OCIO"); }
    T::TempDir dir;
};

TEST_F(ColorSpaceTransformTest, KnownValuesByNameRoleAndAlias) {
    struct Case {
        const char *from, *to;
        double (*model)(double);
        double tol;
    };
    // Roles and aliases name the same spaces as the names do. The tolerance covers the fast powers of the
    // optimised transform.
    const Case cases[] = {
        {"sRGB", "Linear Rec.709", SrgbToLinear, 2e-5},
        {"srgb_texture", "scene_linear", SrgbToLinear, 2e-5},
        {"lin_rec709", "sRGB", LinearToSrgb, 2e-5},
        {"cineon", "linear", CineonToLinear, 2e-5},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.from) + " -> " + c.to);
        Rig rig(Greys(kValues));
        rig.Add(c.from, c.to);
        Ref<Image> out = rig.Run();
        ASSERT_TRUE(out) << T::ConsoleText(rig.doc);
        for (size_t x = 0; x < kValues.size(); ++x) {
            const double want = c.model(kValues[x]);
            T::ExpectPixelNear(out->GetFlt(static_cast<int>(x), 0),
                               {static_cast<float>(want), static_cast<float>(want), static_cast<float>(want), 0.25f},
                               c.tol * std::max(1.0, std::fabs(want)), std::to_string(kValues[x]));
        }
    }
}

TEST_F(ColorSpaceTransformTest, RoundTripsAtEveryDepth) {
    // To linear and back through each encoding, within the stated tolerance. (Integer depths store the linear
    // values between the two tools in whole codes and clip them at white, so they do not come back.)
    for (const char *space : {"sRGB", "Rec.709", "Cineon Log", "Linear Rec.2020"})
        for (int depth : {DepthRGBAFlt16, DepthRGBAFlt32}) {
            SCOPED_TRACE(std::string(space) + " depth " + std::to_string(depth));
            Ref<Image> src = T::PatternImage(19, 5, depth, 7);
            Rig rig(src);
            rig.Add(space, "scene_linear");
            rig.Add("scene_linear", space);
            Ref<Image> out = rig.Run();
            ASSERT_TRUE(out);
            const double tol = depth == DepthRGBAFlt16 ? 4e-3 : 1e-4;
            double worst = 0;
            for (int y = 0; y < 5; ++y)
                for (int x = 0; x < 19; ++x) {
                    const FltPixel a = src->GetFlt(x, y), b = out->GetFlt(x, y);
                    // Values far below black leave the curves' range of use; compare from black up.
                    if (std::min({a.R, a.G, a.B}) < 0) continue;
                    worst = std::max<double>({worst, std::fabs(a.R - b.R) / std::max(1.f, a.R),
                                              std::fabs(a.G - b.G) / std::max(1.f, a.G),
                                              std::fabs(a.B - b.B) / std::max(1.f, a.B), std::fabs(a.A - b.A)});
                }
            EXPECT_LE(worst, tol);
        }
}

TEST_F(ColorSpaceTransformTest, ConfigurationFromPreferenceEnvironmentOrBuiltIn) {
    // A configuration of our own: its space "squared" is the square of its reference.
    const std::string own = "ocio_profile_version: 2\nroles: {default: ref}\ncolorspaces:\n"
                            "  - !<ColorSpace> {name: ref}\n"
                            "  - !<ColorSpace>\n    name: squared\n"
                            "    from_scene_reference: !<ExponentTransform> {value: 2}\n";
    std::ofstream(dir / "own.ocio") << own;
    struct Case {
        const char *pref, *env;
        double want; // 0.5 from ref to squared; not found in the built-in configuration
    };
    const Case cases[] = {{"own.ocio", nullptr, 0.25}, {nullptr, "own.ocio", 0.25}, {nullptr, nullptr, -1}};
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.pref ? "preference" : c.env ? "environment" : "built-in"));
        Rig rig(Greys({0.5}));
        rig.doc.SetFilePath(dir / "flow.orvane");
        if (c.pref) rig.doc.SetColorConfigPath(c.pref);
        if (c.env) setenv("OCIO", (dir / c.env).c_str(), 1);
        rig.Add("ref", "squared");
        Ref<Image> out = rig.Run();
        if (c.want < 0) {
            EXPECT_FALSE(out);
            EXPECT_NE(T::ConsoleText(rig.doc).find("no colour space 'ref' in the configuration built-in"),
                      std::string::npos)
                << T::ConsoleText(rig.doc);
        } else {
            ASSERT_TRUE(out) << T::ConsoleText(rig.doc);
            EXPECT_NEAR(out->GetFlt(0, 0).R, c.want, 1e-5);
        }
        unsetenv("OCIO");
    }
}

TEST_F(ColorSpaceTransformTest, FailuresNameWhatIsMissing) {
    struct Case {
        const char *config, *from, *to, *line;
    };
    const Case cases[] = {
        {nullptr, "sRGB", "Nowhere", "no colour space 'Nowhere' in the configuration built-in"},
        {nullptr, "", "sRGB", "no colour space '' in the configuration built-in"},
        {"missing.ocio", "sRGB", "linear", "cannot read colour configuration '"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.line);
        Rig rig(Greys({0.5}));
        if (c.config) rig.doc.SetColorConfigPath(dir / c.config);
        Operator *cst = rig.Add(c.from, c.to);
        EXPECT_FALSE(rig.Run());
        const std::string console = T::ConsoleText(rig.doc);
        EXPECT_NE(console.find(cst->Name() + ": " + c.line), std::string::npos) << console;
        if (c.config) EXPECT_NE(console.find(dir / c.config), std::string::npos) << console;
    }
}

TEST_F(ColorSpaceTransformTest, LoaderReadsFromAConfigurationSpace) {
    // A float file of sRGB-encoded greys; the Loader's Color Space choice takes them to scene_linear.
    const std::string file = dir / "greys.raw";
    std::string error;
    ASSERT_TRUE(Clip(file).PutFrameTagList(0, Greys(kValues).Get(), {}, error)) << error;
    struct Case {
        const char *space;
        bool fails;
    };
    for (const Case &c : {Case{"srgb_texture", false}, Case{"Nowhere", true}}) {
        SCOPED_TRACE(c.space);
        OrvaneDoc doc;
        Operator *loader = doc.AddTool(OvID("Loader"), "Plate");
        ASSERT_TRUE(loader);
        for (const auto &[id, value] : {std::pair<const char *, ScriptVal>{"Clip", ScriptVal(file)},
                                        {"GamutSpace", ScriptVal("ColorSpace")},
                                        {"GamutColorSpace", ScriptVal(c.space)}})
            ASSERT_EQ(ApplyInputValue(doc, loader->FindInput(id), value), "") << id;
        Ref<Image> out = T::EvalImage(loader);
        if (c.fails) {
            EXPECT_FALSE(out);
            EXPECT_NE(T::ConsoleText(doc).find("Plate: no colour space 'Nowhere' in the configuration built-in"),
                      std::string::npos)
                << T::ConsoleText(doc);
            continue;
        }
        ASSERT_TRUE(out) << T::ConsoleText(doc);
        for (size_t x = 0; x < kValues.size(); ++x)
            EXPECT_NEAR(out->GetFlt(static_cast<int>(x), 0).G, SrgbToLinear(kValues[x]),
                        2e-5 * std::max(1.0, kValues[x]))
                << kValues[x];
    }
}

TEST_F(ColorSpaceTransformTest, SaverWritesToAConfigurationSpace) {
    OrvaneDoc doc;
    Operator *source = T::AddImageSource(doc, "Src", Greys(kValues));
    Operator *saver = doc.AddTool(OvID("Saver"), "Out");
    ASSERT_TRUE(saver && saver->FindInput("Input")->ConnectTo(source->FindMainOutput()));
    for (const auto &[id, value] : {std::pair<const char *, ScriptVal>{"Clip", ScriptVal(dir / "out.0000.raw")},
                                    {"GamutSpace", ScriptVal("ColorSpace")},
                                    {"GamutColorSpace", ScriptVal("color_picking")}})
        ASSERT_EQ(ApplyInputValue(doc, saver->FindInput(id), value), "") << id;
    RenderTask task;
    EvalOptions opt;
    opt.task = &task;
    ASSERT_TRUE(Evaluate(saver->FindMainOutput(), 0.0, opt)) << T::ConsoleText(doc);
    std::vector<std::string> written;
    for (const auto &entry : std::filesystem::directory_iterator(dir.path)) written.push_back(entry.path().string());
    ASSERT_EQ(written.size(), 1u);
    std::string error;
    Ref<Image> back = Clip(written[0]).GetFrameTagList(0, {}, error);
    ASSERT_TRUE(back) << error;
    for (size_t x = 0; x < kValues.size(); ++x)
        EXPECT_NEAR(back->GetFlt(static_cast<int>(x), 0).B, LinearToSrgb(kValues[x]), 2e-5) << kValues[x];
}

TEST_F(ColorSpaceTransformTest, SameAsOiiotool) {
    if (!T::HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    std::ofstream(dir / "builtin.ocio") << ColorConfig::BuiltInText();
    Ref<Image> src = T::PatternImage(24, 12, DepthRGBAFlt32, 4);
    T::WritePfm(*src, dir / "in.pfm");
    ASSERT_TRUE(T::RunQuiet("oiiotool --colorconfig " + dir / "builtin.ocio" + " " + dir / "in.pfm" +
                            " --colorconvert sRGB \"Linear Rec.2020\" -o " + dir / "out.exr"));
    Ref<Image> theirs = T::ReadOiioDump(dir / "out.exr", 24, 12);
    ASSERT_TRUE(theirs);
    Rig rig(src);
    rig.Add("sRGB", "Linear Rec.2020");
    Ref<Image> ours = rig.Run();
    ASSERT_TRUE(ours);
    double worst = 0;
    for (int y = 0; y < 12; ++y)
        for (int x = 0; x < 24; ++x) {
            const FltPixel a = ours->GetFlt(x, y), b = theirs->GetFlt(x, y);
            worst = std::max<double>({worst, std::fabs(a.R - b.R), std::fabs(a.G - b.G), std::fabs(a.B - b.B)});
        }
    EXPECT_LT(worst, 1e-5);
}

} // namespace
} // namespace Orvane::cst_test
