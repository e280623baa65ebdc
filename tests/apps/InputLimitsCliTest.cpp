// The command line against input that could stall or exhaust it: a FIFO in place of a file ends `orvane info`
// and `orvane render` at once, and --memory-limit bounds a render's images, failing with what a tool needed.
#include <gtest/gtest.h>

#include <sys/stat.h>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

/// A flow of `tools` whose Saver writes frame 0 of `input` to `file` in `dir`.
std::string Flow(const TempDir &dir, const std::string &tools, const char *input, const char *file) {
    const std::string saver = "Saver1 = Saver { Inputs = { Clip = \"" + (dir.Path() / file).string() + "\", Input = ";
    return Quote(dir.File("test.flow", "Orvane.Document { Version = 1, RenderRange = { 0, 0 }, Tools = {\n" + tools +
                                           saver + input + " } } } }\n")
                     .string());
}

TEST(InputLimits, AFifoEndsInfoAndRenderAtOnceWithAnError) {
    TempDir dir;
    const std::string fifo = (dir.Path() / "plate.tga").string();
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    const CliRun info = Orvane("info " + Quote(fifo));
    EXPECT_EQ(info.exitCode, 3);
    EXPECT_EQ(info.err, "ERROR: " + fifo + " is not a regular file (a FIFO)\n");
    const CliRun render = Orvane("render " + Flow(dir, "Loader1 = Loader { Inputs = { Clip = \"" + fifo + "\" } },",
                                                  "Loader1.Output", "out.tga"));
    EXPECT_EQ(render.exitCode, 3) << render.err;
    EXPECT_TRUE(Has(render.err, "Loader1 failed to load file \"" + fifo + "\" : is not a regular file (a FIFO)"));
}

TEST(InputLimits, MemoryLimitBoundsARenderAndSaysWhatAToolNeeded) {
    TempDir dir;
    const std::string flow = Flow(dir,
                                  "Background1 = Background { Inputs = { Width = 1024, Height = 1024, Depth = 4 } },"
                                  "Blur1 = Blur { Inputs = { XBlurSize = 4, Input = Background1.Output } },",
                                  "Blur1.Output", "out.raw");
    // 16 MiB a frame: the render needs two of them at a time.
    const CliRun tight = Orvane("render " + flow + " --memory-limit 8M");
    EXPECT_EQ(tight.exitCode, 3);
    EXPECT_TRUE(Has(tight.out + tight.err,
                    "Background1: needs 16 MiB for a 1024x1024 RGBA float32 image; --memory-limit is 8 MiB"));
    EXPECT_EQ(Orvane("render " + flow + " --memory-limit 40M").exitCode, 0);
}

} // namespace
} // namespace Orvane::clitest
