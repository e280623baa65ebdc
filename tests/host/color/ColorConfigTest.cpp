// ColorConfig: names, roles and aliases of the built-in configuration, configurations that cannot be read, and the
// processors' values below black and through a described transform.
#include <string>

#include <gtest/gtest.h>

#include "host/color/ColorConfig.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane {
namespace {

TEST(ColorConfig, BuiltInResolvesNamesRolesAndAliases) {
    const auto config = ColorConfig::BuiltIn();
    ASSERT_TRUE(config);
    EXPECT_EQ(config->Source(), "built-in");
    const std::pair<const char *, const char *> cases[] = {
        {"sRGB", "sRGB"},
        {"SRGB", "sRGB"},
        {"scene_linear", "Linear Rec.709"},
        {"lin_srgb", "Linear Rec.709"},
        {"compositing_log", "Cineon Log"},
        {"bt709", "Rec.709"},
        {"data", "Raw"},
        {"nowhere", ""},
        {"", ""},
    };
    for (const auto &[name, want] : cases) EXPECT_EQ(config->Resolve(name), want) << name;
    EXPECT_EQ(config->Spaces().size(), 6u);
    for (const auto &[role, space] : config->Roles()) EXPECT_FALSE(config->Resolve(space).empty()) << role;
}

TEST(ColorConfig, UnreadableConfigurationsNameTheFile) {
    for (const char *path : {"/nonexistent/config.ocio", "/dev/null"}) {
        std::string error;
        EXPECT_FALSE(ColorConfig::Load(path, &error));
        EXPECT_NE(error.find(std::string("cannot read colour configuration '") + path + "'"), std::string::npos)
            << error;
    }
}

TEST(ColorConfig, ProcessorValues) {
    std::string error;
    // Below black the sRGB curve goes on as its linear toe, whose slope is the one at which the two pieces meet
    // (12.923, against the standard's rounded 12.92).
    const auto toLinear = ColorConfig::BuiltIn()->SpaceProcessor("sRGB", "linear", &error);
    ASSERT_TRUE(toLinear) << error;
    float px[8] = {-0.1f, 0.02f, 0.5f, 0.3f, 1.f, 1.f, 1.f, 1.f};
    toLinear->Apply(px, 2);
    EXPECT_NEAR(px[0], -0.1 / 12.92, 3e-4 * 0.1 / 12.92);
    EXPECT_NEAR(px[1], 0.02 / 12.92, 3e-4 * 0.02 / 12.92);
    EXPECT_FLOAT_EQ(px[3], 0.3f); // alpha passes
    EXPECT_NEAR(px[4], 1.0, 2e-5);
    // A described matrix: swaps red and blue, doubles green.
    const auto swap = ColorConfig::DescribedProcessor(
        "!<MatrixTransform> {matrix: [0, 0, 1, 0, 0, 2, 0, 0, 1, 0, 0, 0, 0, 0, 0, 1]}", &error);
    ASSERT_TRUE(swap) << error;
    float c[4] = {0.1f, 0.2f, 0.3f, 0.4f};
    swap->Apply(c, 1);
    EXPECT_FLOAT_EQ(c[0], 0.3f);
    EXPECT_FLOAT_EQ(c[1], 0.4f);
    EXPECT_FLOAT_EQ(c[2], 0.1f);
    EXPECT_FALSE(ColorConfig::DescribedProcessor("!<NoSuchTransform> {}", &error));
    EXPECT_TRUE(ColorConfig::BuiltIn()->SpaceProcessor("linear", "scene_linear", &error)->IsNoOp());
}

TEST(ColorConfig, DocumentPreferenceIsReadWrittenAndChecked) {
    struct Case {
        const char *prefs;
        bool ok;
        const char *path;
    };
    const Case cases[] = {{"ColorConfig = \"looks/show.ocio\"", true, "looks/show.ocio"},
                          {"ColorConfig = 3", false, ""},
                          {"FFWidth = 640", true, ""}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.prefs);
        OrvaneDoc doc;
        const std::string text = std::string("Orvane.Document { Prefs = { ") + c.prefs + " } }\n";
        const DocumentLoadResult result = LoadDocument(text, doc);
        EXPECT_EQ(result.ok, c.ok) << result.error;
        if (!c.ok) continue;
        EXPECT_EQ(doc.ColorConfigPath(), c.path);
        // Saved and read again: the same preference; relative names are taken from the document's folder.
        OrvaneDoc again;
        ASSERT_TRUE(LoadDocument(SaveDocument(doc), again).ok);
        EXPECT_EQ(again.ColorConfigPath(), c.path);
        again.SetFilePath("/shows/a/comp.orvane");
        EXPECT_EQ(ColorConfig::PathFor(&again), *c.path ? std::string("/shows/a/") + c.path : "");
    }
}

} // namespace
} // namespace Orvane
