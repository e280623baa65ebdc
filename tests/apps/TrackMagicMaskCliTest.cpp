// Magic Mask strokes and runs from the command line, on examples/magic-mask.flow: strokes cleared, added and
// refused, and runs that record their span; the example's object tracked and graded.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <string>

#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "tests/apps/CliRun.h"
#include "tests/support/TestSupport.h"

namespace Orvane::clitest::magicmask {
namespace {

namespace fs = std::filesystem;

/// Points the Magic Mask disk cache at a folder of the test for its lifetime (a user's cache must not leak in).
struct CacheFolder {
    explicit CacheFolder(const fs::path &dir) {
        if (const char *old = std::getenv(kVar)) previous = old;
        setenv(kVar, dir.c_str(), 1);
    }
    ~CacheFolder() {
        if (previous.empty())
            unsetenv(kVar);
        else
            setenv(kVar, previous.c_str(), 1);
    }
    static constexpr const char *kVar = "ORVANE_MAGIC_MASK_CACHE";
    std::string previous;
};

TEST(MagicMaskCli, StrokesAndRuns) {
    TempDir dir;
    const CacheFolder cache(dir.Path() / "cache");
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

    const CliRun r = Orvane("track " + flow + " Mask --frames 2-5 --reverse");
    ASSERT_EQ(r.exitCode, 0) << r.err;
    const std::string after = ReadFile(path);
    for (const char *saved : {"ReferenceTime = 5", "ProcessedFramesLow = 2", "ProcessedFramesHigh = 5"})
        EXPECT_NE(after.find(saved), std::string::npos) << saved << "\n" << after;
}

// The example as a user runs it, with the program's own provider: its two strokes on frame 1 tracked over the
// shot from the command line, then, in another process (here, this one), the mask of frames the run covered
// against the true disc of the plate (centre x 0.31 + 0.02 t, y 0.5, radius 0.2 of the height on the 320 x 180
// frame), and the graded render brighter inside the object and untouched well outside it.
TEST(MagicMaskCli, TheExampleTracksItsObjectAndGradesIt) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    const CacheFolder cache(dir.Path() / "cache");
    const fs::path path = dir.Path() / "magic-mask.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/magic-mask.flow", path);
    const std::string flow = Quote(path.string());
    ASSERT_EQ(Orvane("track " + flow + " Mask --frames 1-8").exitCode, 0);

    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(ReadFile(path), *doc).ok);
    for (const double t : {1.0, 4.0, 8.0}) {
        const Ref<Image> mask = Orvane::Test::EvalImage(doc->FindTool("Mask"), t);
        ASSERT_TRUE(mask) << t;
        int both = 0, either = 0;
        for (int y = 0; y < 180; ++y)
            for (int x = 0; x < 320; ++x) {
                const double dx = ((x + 0.5) / 320 - 0.31 - 0.02 * t) * 1.7778, dy = (y + 0.5) / 180 - 0.5;
                const bool truth = std::hypot(dx, dy) < 0.2, got = mask->GetFlt(x, y).A >= 0.5f;
                both += truth && got;
                either += truth || got;
            }
        EXPECT_GT(double(both) / either, 0.9) << "intersection over union at frame " << t;
    }

    ASSERT_EQ(Orvane("render " + flow + " --frames 8").exitCode, 0);
    const Ref<Image> graded = ReadFrame(dir.Path() / "out/magic-mask/graded.0008.exr");
    const Ref<Image> plate = Orvane::Test::EvalImage(doc->FindTool("Plate"), 8.0);
    ASSERT_TRUE(graded && plate);
    const int cx = static_cast<int>((0.31 + 0.16) * 320);
    EXPECT_GT(graded->GetFlt(cx, 90).R, plate->GetFlt(cx, 90).R * 1.2f) << "inside the object";
    EXPECT_NEAR(graded->GetFlt(300, 20).R, plate->GetFlt(300, 20).R, 1e-5) << "well outside it";
}

} // namespace
} // namespace Orvane::clitest::magicmask
