#include <string>

#include <gtest/gtest.h>

#include "host/color/ColorConfig.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane {
namespace {

TEST(ColorConfig, BuiltInNamesRolesAliasesWhatCannotBeReadAndTheDocumentPreference) {
    const auto config = ColorConfig::BuiltIn();
    const std::pair<const char *, const char *> names[] = {{"SRGB", "sRGB"},
                                                           {"scene_linear", "Linear Rec.709"},
                                                           {"lin_srgb", "Linear Rec.709"},
                                                           {"bt709", "Rec.709"},
                                                           {"compositing_log", "Cineon Log"},
                                                           {"data", "Raw"},
                                                           {"nowhere", ""},
                                                           {"", ""}};
    for (const auto &[name, want] : names) EXPECT_EQ(config->Resolve(name), want) << name;
    EXPECT_EQ(config->Spaces().size(), 6u);
    for (const auto &[role, space] : config->Roles()) EXPECT_FALSE(config->Resolve(space).empty()) << role;
    std::string error;
    for (const char *path : {"/nonexistent/config.ocio", "/dev/null"})
        EXPECT_TRUE(!ColorConfig::Load(path, &error) &&
                    error.find(std::string("cannot read colour configuration '") + path + "'") != std::string::npos)
            << error;
    EXPECT_FALSE(ColorConfig::DescribedProcessor("!<NoSuchTransform> {}", &error));
    // The document preference, read, checked, saved and read again; relative names from the document's folder.
    const std::tuple<const char *, bool, const char *> cases[] = {
        {"ColorConfig = \"looks/show.ocio\"", true, "looks/show.ocio"},
        {"ColorConfig = 3", false, ""},
        {"FFWidth = 640", true, ""}};
    for (const auto &[prefs, ok, path] : cases) {
        SCOPED_TRACE(prefs);
        OrvaneDoc doc, again;
        const DocumentLoadResult result =
            LoadDocument(std::string("Orvane.Document { Prefs = { ") + prefs + " } }\n", doc);
        EXPECT_EQ(result.ok, ok) << result.error;
        if (!ok) continue;
        ASSERT_TRUE(LoadDocument(SaveDocument(doc), again).ok);
        EXPECT_TRUE(doc.ColorConfigPath() == path && again.ColorConfigPath() == path);
        again.SetFilePath("/shows/a/comp.orvane");
        EXPECT_EQ(ColorConfig::PathFor(&again), *path ? std::string("/shows/a/") + path : "");
    }
}

} // namespace
} // namespace Orvane
