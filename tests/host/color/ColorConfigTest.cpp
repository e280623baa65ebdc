// ColorConfig: names, roles and aliases of the built-in configuration, what cannot be read, values below black,
// and the document preference.
#include <string>

#include <gtest/gtest.h>

#include "host/color/ColorConfig.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane {
namespace {

TEST(ColorConfig, BuiltInNamesRolesAndAliases) {
    const auto config = ColorConfig::BuiltIn();
    const std::pair<const char *, const char *> cases[] = {{"SRGB", "sRGB"},
                                                           {"scene_linear", "Linear Rec.709"},
                                                           {"lin_srgb", "Linear Rec.709"},
                                                           {"bt709", "Rec.709"},
                                                           {"compositing_log", "Cineon Log"},
                                                           {"data", "Raw"},
                                                           {"nowhere", ""},
                                                           {"", ""}};
    for (const auto &[name, want] : cases) EXPECT_EQ(config->Resolve(name), want) << name;
    EXPECT_EQ(config->Spaces().size(), 6u);
    for (const auto &[role, space] : config->Roles()) EXPECT_FALSE(config->Resolve(space).empty()) << role;
}

TEST(ColorConfig, FailuresNameWhatCannotBeRead) {
    std::string error;
    for (const char *path : {"/nonexistent/config.ocio", "/dev/null"}) {
        EXPECT_FALSE(ColorConfig::Load(path, &error));
        EXPECT_NE(error.find(std::string("cannot read colour configuration '") + path + "'"), std::string::npos)
            << error;
    }
    EXPECT_FALSE(ColorConfig::DescribedProcessor("!<NoSuchTransform> {}", &error));
}

TEST(ColorConfig, SrgbBelowBlackFollowsItsToe) {
    // The toe's slope is the one at which the curve's two pieces meet (12.923, the standard rounds it to 12.92).
    std::string error;
    const auto toLinear = ColorConfig::BuiltIn()->SpaceProcessor("sRGB", "linear", &error);
    ASSERT_TRUE(toLinear) << error;
    float px[4] = {-0.1f, 0.02f, 0.5f, 0.3f};
    toLinear->Apply(px, 1);
    EXPECT_NEAR(px[0], -0.1 / 12.92, 3e-4 * 0.1 / 12.92);
    EXPECT_NEAR(px[1], 0.02 / 12.92, 3e-4 * 0.02 / 12.92);
    EXPECT_EQ(px[3], 0.3f); // alpha passes
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
