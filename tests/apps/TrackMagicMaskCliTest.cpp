// Magic Mask strokes and runs from the command line, on the example flow (examples/magic-mask.flow): strokes added,
// cleared and refused, and a tracking run that records its span with whichever provider of the object-mask kernel
// the program has (or says plainly that it has none, saving nothing).
#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"
#include "tests/apps/CliRun.h"

namespace Orvane::clitest::magicmask {
namespace {

namespace fs = std::filesystem;

/// The Mask tool's strokes in the saved flow, in their document form ("nil" when none).
std::string StrokesOf(const fs::path &flow) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    if (!LoadDocument(ReadFile(flow), *doc).ok) return "unreadable";
    const Ref<Parameter> v = doc->FindTool("Mask")->FindInput("Strokes")->Constant();
    return v ? v->ToScript().ToText() : "nil";
}

TEST(MagicMaskCli, StrokesAreAddedClearedAndRefused) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    const fs::path path = dir.Path() / "magic-mask.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/magic-mask.flow", path);
    const std::string flow = Quote(path.string());
    const std::string saved = StrokesOf(path);
    EXPECT_NE(saved.find("0.36"), std::string::npos) << saved; // the example keeps its strokes

    // Refusals leave the flow as it was.
    const struct {
        std::string args, message;
    } refused[] = {
        {"stroke " + flow + " Mask add", "add needs at least one point"},
        {"stroke " + flow + " Mask add 0.5", "a point"},
        {"stroke " + flow + " Mask paint 0.5,0.5", "the action is add, sub or clear"},
        {"stroke " + flow + " Mask clear 0.5,0.5", "clear takes no points"},
        {"stroke " + flow + " Plate add 0.5,0.5", "Plate (Custom) takes no strokes"},
        {"stroke " + flow + " Mask2 add 0.5,0.5", "the flow has no tool 'Mask2'"},
    };
    for (const auto &c : refused) {
        const CliRun r = Orvane(c.args);
        EXPECT_EQ(r.exitCode, 2) << c.args << "\n" << r.err;
        EXPECT_NE(r.err.find(c.message), std::string::npos) << c.args << "\n" << r.err;
    }
    EXPECT_EQ(StrokesOf(path), saved);

    ASSERT_EQ(Orvane("stroke " + flow + " Mask clear").exitCode, 0);
    EXPECT_EQ(StrokesOf(path), "nil");
    const CliRun add = Orvane("stroke " + flow + " Mask add 0.25,0.5 0.75,0.125 1,1");
    ASSERT_EQ(add.exitCode, 0) << add.err;
    EXPECT_NE(add.out.find("added a positive stroke of 3 points"), std::string::npos) << add.out;
    ASSERT_EQ(Orvane("stroke " + flow + " Mask sub 0.5,0.875").exitCode, 0);
    const std::string now = StrokesOf(path);
    EXPECT_NE(now.find("0.25, 0.5, 0.75, 0.125, 1, 1"), std::string::npos) << now;
    EXPECT_NE(now.find("0.5, 0.875"), std::string::npos) << now;
}

TEST(MagicMaskCli, ATrackingRunRecordsItsSpanOrSaysWhyNot) {
    TempDir dir;
    const fs::path path = dir.Path() / "magic-mask.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/magic-mask.flow", path);
    const std::string before = ReadFile(path);
    const CliRun r = Orvane("track " + Quote(path.string()) + " Mask --frames 2-5 --reverse");
    if (r.exitCode == 0) {
        EXPECT_NE(r.out.find("tracked Mask from frame 5 to 2"), std::string::npos) << r.out;
        const std::string after = ReadFile(path);
        EXPECT_NE(after.find("ReferenceTime = 5"), std::string::npos) << after;
        EXPECT_NE(after.find("ProcessedFramesLow = 2"), std::string::npos) << after;
        EXPECT_NE(after.find("ProcessedFramesHigh = 5"), std::string::npos) << after;
    } else {
        EXPECT_EQ(r.exitCode, 3) << r.err;
        EXPECT_NE(r.err.find("Mask: no provider of the kernel \"GetObjectMask\""), std::string::npos) << r.err;
        EXPECT_EQ(ReadFile(path), before);
    }
}

} // namespace
} // namespace Orvane::clitest::magicmask
