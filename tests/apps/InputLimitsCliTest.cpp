// The command line against input that could stall or exhaust it: a FIFO in
// place of a file ends `orvane info` and `orvane render` at once, and
// --memory-limit bounds a render's images, failing with what a tool needed.
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

class InputLimits : public ::testing::Test {
protected:
    void SetUp() override { fs::create_directories(dir); }
    void TearDown() override { fs::remove_all(dir); }
    /// Runs orvane in the folder (30 s at most: 124 means it was still
    /// running); the exit code, and stdout and stderr together in `output`.
    int Orvane(const std::string &args) {
        const std::string cmd = "cd '" + dir.string() + "' && timeout 30 '" + ORVANE_BINARY_DIR + "/orvane' " + args +
                                " >log 2>&1 </dev/null";
        const int status = std::system(cmd.c_str());
        std::ostringstream text;
        text << std::ifstream(dir / "log").rdbuf();
        output = text.str();
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    void Flow(const std::string &tools) {
        std::ofstream(dir / "test.flow")
            << "Orvane.Document {\n\tVersion = 1,\n\tRenderRange = { 0, 0 },\n\tTools = {\n"
            << tools << "\t},\n}\n";
    }
    fs::path dir = fs::temp_directory_path() / ("orvane-limits-" + std::to_string(getpid()));
    std::string output;
};

TEST_F(InputLimits, AFifoEndsInfoAndRenderAtOnceWithAnError) {
    ASSERT_EQ(mkfifo((dir / "plate.tga").c_str(), 0600), 0);
    EXPECT_EQ(Orvane("info plate.tga"), 3);
    EXPECT_EQ(output, "ERROR: plate.tga is not a regular file (a FIFO)\n");
    Flow("\t\tLoader1 = Loader { Inputs = { Clip = \"plate.tga\" } },\n"
         "\t\tSaver1 = Saver { Inputs = { Clip = \"out.tga\", Input = Loader1.Output } },\n");
    EXPECT_EQ(Orvane("render test.flow"), 3) << output;
    EXPECT_NE(output.find("Loader1 failed to load file \"" + (dir / "plate.tga").string() +
                          "\" : is not a regular file (a FIFO)"),
              std::string::npos)
        << output;
}

TEST_F(InputLimits, MemoryLimitBoundsARenderAndSaysWhatAToolNeeded) {
    Flow("\t\tBackground1 = Background { Inputs = { Width = 1024, Height = 1024, Depth = 4 } },\n"
         "\t\tBlur1 = Blur { Inputs = { XBlurSize = 4, Input = Background1.Output } },\n"
         "\t\tSaver1 = Saver { Inputs = { Clip = \"out.raw\", Input = Blur1.Output } },\n");
    // 16 MiB a frame: the render needs two of them at a time.
    EXPECT_EQ(Orvane("render test.flow --memory-limit 8M"), 3);
    EXPECT_NE(output.find("Background1: needs 16 MiB for a 1024x1024 RGBA float32 image; --memory-limit is 8 MiB"),
              std::string::npos)
        << output;
    EXPECT_EQ(Orvane("render test.flow --memory-limit 40M"), 0) << output;
}

} // namespace
} // namespace Orvane::inputlimitstest
