// Magic Mask strokes and runs from the command line, on examples/magic-mask.flow: strokes cleared, added and
// refused, and a run that records its span with whichever provider of the object-mask kernel the program has (or
// says plainly that it has none, saving nothing).
#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest::magicmask {
namespace {

namespace fs = std::filesystem;

TEST(MagicMaskCli, StrokesAndRuns) {
    TempDir dir;
    const fs::path path = dir.Path() / "magic-mask.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/magic-mask.flow", path);
    const std::string flow = Quote(path.string()), example = ReadFile(path);
    // Refusals leave the flow as it was.
    const struct {
        std::string args, message;
    } refused[] = {{"Mask add", "add needs at least one point"},
                   {"Mask add 0.5", "a point"},
                   {"Mask clear 0.5,0.5", "clear takes no points"},
                   {"Plate add 0.5,0.5", "Plate (Custom) takes no strokes"}};
    for (const auto &c : refused) {
        const CliRun r = Orvane("stroke " + flow + " " + c.args);
        EXPECT_EQ(r.exitCode, 2) << c.args;
        EXPECT_NE(r.err.find(c.message), std::string::npos) << c.args << "\n" << r.err;
    }
    EXPECT_EQ(ReadFile(path), example);

    ASSERT_EQ(Orvane("stroke " + flow + " Mask clear").exitCode, 0);
    EXPECT_EQ(ReadFile(path).find("Strokes"), std::string::npos);
    const CliRun add = Orvane("stroke " + flow + " Mask add 0.25,0.5 0.75,0.125");
    EXPECT_NE(add.out.find("added a positive stroke of 2 points"), std::string::npos) << add.out << add.err;
    ASSERT_EQ(Orvane("stroke " + flow + " Mask sub 0.5,0.875").exitCode, 0);
    EXPECT_NE(ReadFile(path).find("PosStrokes = {\n\t\t\t\t\t\t{ 0.25, 0.5, 0.75, 0.125 },\n\t\t\t\t\t},\n\t\t\t\t\t"
                                  "NegStrokes = {\n\t\t\t\t\t\t{ 0.5, 0.875 },"),
              std::string::npos)
        << ReadFile(path);

    const std::string before = ReadFile(path);
    const CliRun r = Orvane("track " + flow + " Mask --frames 2-5 --reverse");
    if (r.exitCode == 0) {
        const std::string after = ReadFile(path);
        for (const char *saved : {"ReferenceTime = 5", "ProcessedFramesLow = 2", "ProcessedFramesHigh = 5"})
            EXPECT_NE(after.find(saved), std::string::npos) << saved << "\n" << after;
    } else {
        EXPECT_EQ(r.exitCode, 3) << r.err;
        EXPECT_NE(r.err.find("Mask: no provider of the kernel \"GetObjectMask\""), std::string::npos) << r.err;
        EXPECT_EQ(ReadFile(path), before);
    }
}

} // namespace
} // namespace Orvane::clitest::magicmask
