// The orvane command line, run as a separate process the way scripts and
// render farms run it: output, JSON, and exit codes.
#include <gtest/gtest.h>

#include <csignal>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/wait.h>
#include <unistd.h>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

TEST(CliTools, SearchFindsClassesByAliasAndMarksUnbuiltOnes) {
    const CliRun dither = Orvane("tools --search dither");
    EXPECT_EQ(dither.exitCode, 0) << dither.err;
    EXPECT_TRUE(Contains(dither.out, "ChangeDepth")) << dither.out;
    EXPECT_TRUE(Contains(dither.out, "not yet")) << dither.out;
    EXPECT_TRUE(Contains(dither.out, "1 classes")) << dither.out;

    const CliRun shuffle = Orvane("tools --search shuffle");
    EXPECT_TRUE(Contains(shuffle.out, "ChannelBoolean")) << shuffle.out;

    // Abstract bases and hidden classes show only with --all.
    const CliRun all = Orvane("tools --all");
    EXPECT_EQ(all.exitCode, 0);
    EXPECT_TRUE(Contains(all.out, "201 classes")) << all.out.substr(all.out.size() > 200 ? all.out.size() - 200 : 0);
    EXPECT_TRUE(Contains(all.out, "SwitchBase"));
    const CliRun offered = Orvane("tools");
    EXPECT_TRUE(Contains(offered.out, "194 classes"));
    EXPECT_FALSE(Contains(offered.out, "SwitchBase"));
    EXPECT_FALSE(Contains(offered.out, "TeapotMask"));
}

TEST(CliTools, BadArgumentsExitWithUsageCode) {
    EXPECT_EQ(Orvane("tools --bogus").exitCode, 2);
    EXPECT_EQ(Orvane("frobnicate").exitCode, 2);
    EXPECT_EQ(Orvane("").exitCode, 2);
    const CliRun unknown = Orvane("describe NoSuchClass");
    EXPECT_EQ(unknown.exitCode, 2);
    EXPECT_TRUE(Contains(unknown.err, "ERROR: unknown class 'NoSuchClass'")) << unknown.err;
}

TEST(CliDescribe, ShowsIdentityInputsAndState) {
    const CliRun blur = Orvane("describe Glow");
    EXPECT_EQ(blur.exitCode, 0) << blur.err;
    EXPECT_TRUE(Contains(blur.out, "path:          Tools/Effect/Glow")) << blur.out;
    EXPECT_TRUE(Contains(blur.out, "built:         not yet")) << blur.out;
    EXPECT_TRUE(Contains(blur.out, "EffectMask")) << blur.out;
    // An old class ID names the class that replaced it.
    const CliRun old = Orvane("describe SetBgColor");
    EXPECT_EQ(old.exitCode, 0) << old.err;
    EXPECT_TRUE(Contains(old.out, "SetCanvasColor")) << old.out;
}

TEST(CliEval, DocumentErrorsAreOneLineWithExitTwo) {
    TempDir dir;
    const auto syntax = dir.File("syntax.flow", "Orvane.Document {\n\tTools = {\n\t\tA = Blur { Inputs = { x = } },\n");
    const CliRun r = Orvane("eval " + Quote(syntax.string()) + " A");
    EXPECT_EQ(r.exitCode, 2);
    EXPECT_TRUE(Contains(r.err, "ERROR: " + syntax.string() + ":3:")) << r.err;

    const CliRun missing = Orvane("eval " + Quote((dir.Path() / "none.flow").string()) + " A");
    EXPECT_EQ(missing.exitCode, 2);
    EXPECT_TRUE(Contains(missing.err, "cannot open")) << missing.err;

    const auto ok = dir.File("ok.flow", "Orvane.Document { Tools = { Blur1 = Blur {} } }\n");
    const CliRun noTool = Orvane("eval " + Quote(ok.string()) + " Nope");
    EXPECT_EQ(noTool.exitCode, 2);
    EXPECT_TRUE(Contains(noTool.err, "no tool 'Nope'")) << noTool.err;

    const CliRun badSet = Orvane("eval " + Quote(ok.string()) + " Blur1 --set Blur1.NoSuchInput=1");
    EXPECT_EQ(badSet.exitCode, 2);
    EXPECT_TRUE(Contains(badSet.err, "has no input 'NoSuchInput'")) << badSet.err;

    const CliRun badType = Orvane("eval " + Quote(ok.string()) + " Blur1 --set 'Blur1.Blend=\"high\"'");
    EXPECT_EQ(badType.exitCode, 2);
    EXPECT_TRUE(Contains(badType.err, "expects a number")) << badType.err;

    const auto wrong =
        dir.File("wrong.flow", "Orvane.Document { Tools = { Blur1 = Blur { Inputs = { Blend = {} } } } }");
    const CliRun wrongType = Orvane("eval " + Quote(wrong.string()) + " Blur1");
    EXPECT_EQ(wrongType.exitCode, 2);
    EXPECT_TRUE(Contains(wrongType.err, "Blur1.Blend: expects a number")) << wrongType.err;
}

TEST(CliEval, UnknownClassIsKeptWithAWarningAndFailsOnlyWhenAsked) {
    TempDir dir;
    const auto flow = dir.File(
        "unknown.flow", "Orvane.Document { Tools = { X1 = FutureTool { Inputs = { Q = 3 } }, Blur1 = Blur {} } }");
    const CliRun strict = Orvane("eval " + Quote(flow.string()) + " Blur1");
    EXPECT_EQ(strict.exitCode, 2);
    EXPECT_TRUE(Contains(strict.err, "ERROR: " + flow.string() + ":1:34: X1: unknown class 'FutureTool'"))
        << strict.err;
    const CliRun r = Orvane("eval --lenient " + Quote(flow.string()) + " X1");
    EXPECT_EQ(r.exitCode, 2);
    EXPECT_TRUE(Contains(r.err, "WARNING: " + flow.string() + ":1:34: X1: unknown class 'FutureTool'")) << r.err;
    EXPECT_TRUE(Contains(r.err, "ERROR: tool 'X1' is of a class this program does not know")) << r.err;
}

TEST(CliEval, AToolThatIsNotBuiltFailsWithExitThree) {
    TempDir dir;
    const auto flow = dir.File("planned.flow", "Orvane.Document { Tools = { Glow1 = Glow {} } }");
    const CliRun r = Orvane("eval " + Quote(flow.string()) + " Glow1 --json");
    EXPECT_EQ(r.exitCode, 3);
    EXPECT_TRUE(Contains(r.out, "\"ok\": false")) << r.out;
    EXPECT_TRUE(Contains(r.out, "Glow1: the Glow tool is not available yet")) << r.out;
    EXPECT_TRUE(Contains(r.err, "ERROR: Glow1: the Glow tool is not available yet")) << r.err;
}

} // namespace
} // namespace Orvane::clitest

namespace Orvane::clitest {
namespace {

// ---- orvane render ----

/// A flow whose Saver writes a 16 x 8 gradient as numbered PNG files under `dir`.
std::string GradientFlow(const std::filesystem::path &dir, const std::string &extra = {}) {
    return "Orvane.Document { Version = 1, RenderRange = { 1, 3 }, Tools = {\n"
           "  Bg = Background { Inputs = { Type = \"Gradient\", Width = 16, Height = 8 } },\n"
           "  Out = Saver { Inputs = { Clip = \"" +
           (dir / "out/f.####.png").string() + "\", CreateDir = 1, Input = Bg.Output" + extra + " } },\n} }\n";
}

TEST(CliRender, WritesEveryFrameAndReportsIt) {
    TempDir dir;
    const auto flow = dir.File("a.flow", GradientFlow(dir.Path()));
    const CliRun r = Orvane("render " + Quote(flow.string()) + " --frames 3,1-2");
    EXPECT_EQ(r.exitCode, 0) << r.err;
    EXPECT_TRUE(Contains(r.out, "FRAME 3 done 1/3 saver=Out file=" + (dir.Path() / "out/f.0003.png").string() + " "))
        << r.out;
    EXPECT_TRUE(Contains(r.out, "FRAME 2 done 3/3 saver=Out")) << r.out;
    EXPECT_TRUE(Contains(r.out, "SUMMARY written=3 failed=0 skipped=0")) << r.out;
    for (const char *f : {"f.0001.png", "f.0002.png", "f.0003.png"})
        EXPECT_TRUE(std::filesystem::exists(dir.Path() / "out" / f)) << f;

    // Existing files are left alone with --skip-existing; JSON lines say so.
    const auto before = std::filesystem::last_write_time(dir.Path() / "out/f.0001.png");
    const CliRun again = Orvane("render " + Quote(flow.string()) + " --skip-existing --log-format json");
    EXPECT_EQ(again.exitCode, 0) << again.err;
    EXPECT_TRUE(Contains(again.out, "{\"event\": \"frame\", \"frame\": 1, \"status\": \"skipped\"")) << again.out;
    EXPECT_TRUE(Contains(again.out, "\"event\": \"summary\", \"written\": 0, \"failed\": 0, \"skipped\": 3"))
        << again.out;
    EXPECT_EQ(std::filesystem::last_write_time(dir.Path() / "out/f.0001.png"), before);
}

TEST(CliRender, TheOpenCLDeviceWritesTheSameFilesAsTheCPU) {
    // Four-corner ramps graded by a gamma and a linear chain: kernels that do
    // the rows' float arithmetic (the gamma rounds to 16 bits, hiding the
    // powers' last bits) must give byte-identical files.
    TempDir cpuDir, devDir;
    auto flow = [](const std::filesystem::path &dir) {
        return "Orvane.Document { Version = 1, RenderRange = { 1, 2 }, Tools = {\n"
               "  Bg = Background { Inputs = { Type = \"FourCorner\", Width = 37, Height = 21, Depth = 4,\n"
               "    TopRightRed = 1, BottomLeftGreen = 0.7, BottomRightBlue = 0.9, TopLeftAlpha = 0.8 } },\n"
               "  BC = BrightnessContrast { Inputs = { Gain = 1.2, Saturation = 1.3, Input = Bg.Output } },\n"
               "  BC2 = BrightnessContrast { Inputs = { Gamma = 0.8, Input = BC.Output } },\n"
               "  Out = Saver { Inputs = { Clip = \"" +
               (dir / "out/f.####.png").string() +
               "\", CreateDir = 1, Input = BC2.Output,\n"
               "    OutputFormat = \"PNGFormat\", [\"PNGFormat.Depth\"] = 2 } },\n} }\n";
    };
    const auto cpuFlow = cpuDir.File("a.flow", flow(cpuDir.Path())),
               devFlow = devDir.File("a.flow", flow(devDir.Path()));
    const CliRun cpu = Orvane("render " + Quote(cpuFlow.string()) + " --device cpu");
    ASSERT_EQ(cpu.exitCode, 0) << cpu.err;
    const CliRun dev = Orvane("render " + Quote(devFlow.string()) + " --device opencl");
    if (dev.exitCode == 2 && Contains(dev.err, "--device opencl")) {
        const char *required = std::getenv("ORVANE_REQUIRE_DEVICE");
        if (required && std::string(required) == "opencl") FAIL() << dev.err;
        GTEST_SKIP() << dev.err;
    }
    ASSERT_EQ(dev.exitCode, 0) << dev.err;
    EXPECT_FALSE(Contains(dev.out + dev.err, "device:")) << "a device run failed: " << dev.out << dev.err;
    for (const char *name : {"out/f.0001.png", "out/f.0002.png"}) {
        const std::string a = ReadFile(cpuDir.Path() / name), b = ReadFile(devDir.Path() / name);
        EXPECT_FALSE(a.empty()) << name;
        EXPECT_EQ(a, b) << name;
    }
    const CliRun bad = Orvane("eval " + Quote(cpuFlow.string()) + " BC --device quantum");
    EXPECT_EQ(bad.exitCode, 2);
    EXPECT_TRUE(Contains(bad.err, "--device is cpu, auto, opencl or cuda")) << bad.err;
}

TEST(CliRender, ChunksOfARangeWriteTheSameBytesAsTheWholeRange) {
    TempDir whole, parts;
    const std::string relative = ", SetSequenceStart = 1, SequenceStartFrame = 1001";
    const auto flowWhole = whole.File("a.flow", GradientFlow(whole.Path(), relative));
    const auto flowParts = parts.File("a.flow", GradientFlow(parts.Path(), relative));
    ASSERT_EQ(Orvane("render " + Quote(flowWhole.string()) + " --frames 10-14").exitCode, 0);
    for (const char *chunk : {"1/2", "2/2"})
        ASSERT_EQ(Orvane("render " + Quote(flowParts.string()) + " --frames 10-14 --chunk " + chunk).exitCode, 0);
    for (int n = 1001; n <= 1005; ++n) {
        const std::string name = "out/f." + std::to_string(n) + ".png";
        const std::string a = ReadFile(whole.Path() / name), b = ReadFile(parts.Path() / name);
        EXPECT_FALSE(a.empty()) << name;
        EXPECT_EQ(a, b) << name;
    }
}

TEST(CliRender, BadRequestsAndFailedFramesHaveTheirExitCodes) {
    TempDir dir;
    const auto flow = dir.File("a.flow", GradientFlow(dir.Path()));
    EXPECT_EQ(Orvane("render " + Quote(flow.string()) + " --frames 1-x").exitCode, 2);
    EXPECT_EQ(Orvane("render " + Quote(flow.string()) + " --saver Bg").exitCode, 2);
    EXPECT_EQ(Orvane("render " + Quote(flow.string()) + " --memory-limit lots").exitCode, 2);
    EXPECT_EQ(Orvane("render " + Quote(flow.string()) + " --chunk 3/2").exitCode, 2);
    const auto none = dir.File("none.flow", "Orvane.Document { Version = 1, Tools = { Bg = Background {} } }\n");
    const CliRun noSaver = Orvane("render " + Quote(none.string()));
    EXPECT_EQ(noSaver.exitCode, 2);
    EXPECT_TRUE(Contains(noSaver.err, "has no Saver")) << noSaver.err;

    // A Loader whose frame 2 is missing: that frame fails, the others are written.
    const std::string plate = (dir.Path() / "out/f.####.png").string();
    ASSERT_EQ(Orvane("render " + Quote(flow.string()) + " --frames 1,3").exitCode, 0);
    const auto chain = dir.File("b.flow", "Orvane.Document { Version = 1, RenderRange = { 1, 3 }, Tools = {\n"
                                          "  In = Loader { Inputs = { Clip = \"" +
                                              (dir.Path() / "out/f.0001.png").string() +
                                              "\", GlobalIn = 1 } },\n"
                                              "  Out = Saver { Inputs = { Clip = \"" +
                                              (dir.Path() / "copy/c.####.tga").string() +
                                              "\", CreateDir = 1, Input = In.Output } },\n} }\n");
    const CliRun failed = Orvane("render " + Quote(chain.string()));
    EXPECT_EQ(failed.exitCode, 3) << failed.out << failed.err;
    EXPECT_TRUE(Contains(failed.err, "ERROR: frame 2 saver=Out: In failed to load file")) << failed.err;
    EXPECT_TRUE(Contains(failed.out, "SUMMARY written=2 failed=1")) << failed.out;
    EXPECT_TRUE(Contains(failed.out, "FAILED saver=Out frames=2")) << failed.out;
    EXPECT_TRUE(std::filesystem::exists(dir.Path() / "copy/c.0003.tga"));
    EXPECT_FALSE(std::filesystem::exists(dir.Path() / "copy/c.0002.tga"));
}

TEST(CliRender, InterruptionStopsAndSaysWhatWasWritten) {
    TempDir dir;
    const auto flow = dir.File("a.flow", GradientFlow(dir.Path()));
    ASSERT_EQ(Orvane("render " + Quote(flow.string()) + " --frames 1").exitCode, 0);
    // Frame 2 of the Loader's clip never arrives: "Wait" holds the render there.
    const auto chain = dir.File(
        "b.flow", "Orvane.Document { Version = 1, Tools = {\n"
                  "  In = Loader { Inputs = { Clip = \"" +
                      (dir.Path() / "out/f.0001.png").string() +
                      "\", GlobalIn = 1, GlobalOut = 3, ClipTimeEnd = 2, MissingFrames = 3 } },\n"
                      "  Out = Saver { Inputs = { Clip = \"" +
                      (dir.Path() / "copy/c.####.tga").string() + "\", CreateDir = 1, Input = In.Output } },\n} }\n");
    const auto outFile = dir.Path() / "render.out";
    const pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
        std::freopen(outFile.c_str(), "w", stdout);
        std::freopen((dir.Path() / "render.err").c_str(), "w", stderr);
        const std::string exe = std::string(ORVANE_BINARY_DIR) + "/orvane";
        execl(exe.c_str(), exe.c_str(), "render", chain.c_str(), "--frames", "1-3", static_cast<char *>(nullptr));
        _exit(127);
    }
    // Wait until frame 1 is reported, then interrupt twice: the second abandons the waiting frame.
    for (int i = 0; i < 200 && !Contains(ReadFile(outFile), "FRAME 1 done"); ++i) usleep(50000);
    kill(pid, SIGINT);
    usleep(200000);
    kill(pid, SIGINT);
    int status = 0;
    waitpid(pid, &status, 0);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 130);
    const std::string out = ReadFile(outFile);
    EXPECT_TRUE(Contains(out, "WRITTEN saver=Out frames=1")) << out;
    EXPECT_TRUE(std::filesystem::exists(dir.Path() / "copy/c.0001.tga"));
    EXPECT_FALSE(std::filesystem::exists(dir.Path() / "copy/c.0002.tga"));
}

} // namespace
} // namespace Orvane::clitest
