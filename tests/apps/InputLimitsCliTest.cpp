// The command line against input that could stall or exhaust it: a FIFO in
// place of a file ends `orvane info` and `orvane render` at once with an
// error, and --memory-limit bounds the working images of a render, which
// fails saying what the tool needed.
#include <gtest/gtest.h>

#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "tests/support/TestSupport.h"

namespace Orvane::inputlimitstest {
namespace {

namespace fs = std::filesystem;

struct Outcome {
    int exitCode = -1; ///< 124: it was still running after the time allowed
    std::string output;
};

/// Runs orvane with `args` in `dir` (stdout and stderr together), stopped after 30 s.
Outcome Orvane(const fs::path &dir, const std::string &args) {
    const fs::path log = dir / "log";
    const std::string cmd = "cd '" + dir.string() + "' && timeout 30 '" + ORVANE_BINARY_DIR + "/orvane' " + args +
                            " >'" + log.string() + "' 2>&1 </dev/null";
    const int status = std::system(cmd.c_str());
    std::ostringstream text;
    text << std::ifstream(log).rdbuf();
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, text.str()};
}

class InputLimits : public ::testing::Test {
protected:
    void SetUp() override {
        dir = fs::temp_directory_path() / ("orvane-limits-" + std::to_string(getpid()));
        fs::create_directories(dir);
    }
    void TearDown() override {
        std::error_code ec;
        fs::remove_all(dir, ec);
    }
    void Flow(const std::string &tools) {
        std::ofstream(dir / "test.flow") << "Orvane.Document {\n\tVersion = 1,\n\tGlobalRange = { 0, 0 },\n"
                                            "\tRenderRange = { 0, 0 },\n\tTools = {\n"
                                         << tools << "\t},\n}\n";
    }
    fs::path dir;
};

TEST_F(InputLimits, AFifoEndsInfoAndRenderAtOnceWithAnError) {
    ASSERT_EQ(mkfifo((dir / "plate.tga").c_str(), 0600), 0);
    const Outcome info = Orvane(dir, "info plate.tga");
    EXPECT_EQ(info.exitCode, 3) << info.output;
    EXPECT_EQ(info.output, "ERROR: plate.tga is not a regular file (a FIFO)\n");

    Flow("\t\tLoader1 = Loader { Inputs = { Clip = \"plate.tga\" } },\n"
         "\t\tSaver1 = Saver { Inputs = { Clip = \"out.tga\", Input = Loader1.Output } },\n");
    const Outcome render = Orvane(dir, "render test.flow");
    EXPECT_EQ(render.exitCode, 3) << render.output;
    EXPECT_NE(render.output.find("Loader1 failed to load file \"" + (dir / "plate.tga").string() +
                                 "\" : is not a regular file (a FIFO)"),
              std::string::npos)
        << render.output;
}

TEST_F(InputLimits, MemoryLimitBoundsWorkingImagesAndSaysWhatAToolNeeded) {
    Flow("\t\tBackground1 = Background { Inputs = { Width = 1024, Height = 1024, Depth = 4 } },\n"
         "\t\tBlur1 = Blur { Inputs = { XBlurSize = 4, Input = Background1.Output } },\n"
         "\t\tSaver1 = Saver { Inputs = { Clip = \"out.raw\", Input = Blur1.Output } },\n");
    // 16 MiB a frame: the generator's frame alone passes 8 MiB, its blur passes 24 MiB.
    const struct {
        const char *limit;
        int exitCode;
        const char *says;
    } cases[] = {
        {"8M", 3, "Background1: needs 16 MiB for a 1024x1024 RGBA float32 image; --memory-limit is 8 MiB"},
        {"24M", 3,
         "Blur1: needs 16 MiB for a 1024x1024 RGBA float32 image; --memory-limit is 24 MiB, 16 MiB of it in use"},
        {"40M", 0, "SUMMARY written=1 failed=0"},
    };
    for (const auto &c : cases) {
        const Outcome r = Orvane(dir, std::string("render test.flow --memory-limit ") + c.limit);
        EXPECT_EQ(r.exitCode, c.exitCode) << r.output;
        EXPECT_NE(r.output.find(c.says), std::string::npos) << r.output;
    }
}

} // namespace
} // namespace Orvane::inputlimitstest
