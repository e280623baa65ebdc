// orvane render as a separate process: the files it writes and refuses to write, its report lines and JSON
// events, exit codes and signals, and input that could stall or exhaust it.
#include <gtest/gtest.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <sys/stat.h>
#include <vector>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

namespace fs = std::filesystem;

/// A flow of a 16 x 8 gradient over frames 1-3 and Savers {name, file, more inputs}.
std::string SaverFlow(const std::vector<std::array<std::string, 3>> &savers) {
    std::string flow = "Orvane.Document { Version = 1, RenderRange = { 1, 3 }, Tools = {\n"
                       "  Bg = Background { Inputs = { Type = \"Gradient\", Width = 16, Height = 8 } },\n";
    for (const auto &[name, file, more] : savers)
        flow += "  " + name + " = Saver { Inputs = { Clip = \"" + file + "\", Input = Bg.Output" + more + " } },\n";
    return flow + "} }\n";
}

/// A flow whose Saver writes the gradient as numbered PNG files under `dir`/out.
std::string GradientFlow(const fs::path &dir, const std::string &extra = {}) {
    return SaverFlow({{"Out", (dir / "out/f.####.png").string(), ", CreateDir = 1" + extra}});
}

/// A flow (of these document settings) copying `clip` (`dir`/out/f.0001.png) through a Loader (with more inputs)
/// to numbered TGA files in `dir`/copy.
std::string CopyFlow(const fs::path &dir, const std::string &settings, const std::string &more, fs::path clip = {}) {
    return "Orvane.Document { Version = 1" + settings + ", Tools = {\n  In = Loader { Inputs = { Clip = \"" +
           (clip.empty() ? dir / "out/f.0001.png" : clip).string() + "\", GlobalIn = 1" + more +
           " } },\n  Out = Saver { Inputs = { Clip = \"" + (dir / "copy/c.####.tga").string() +
           "\", CreateDir = 1, Input = In.Output } },\n} }\n";
}

/// `orvane render FLOW ARGS`.
CliRun Render(const fs::path &flow, const std::string &args = "") {
    return Orvane("render " + Quote(flow.string()) + args);
}

/// Names in `dir` that are temporary files of a write.
std::vector<std::string> Temporaries(const fs::path &dir) {
    std::vector<std::string> found;
    std::error_code ec;
    for (fs::directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec))
        if (Contains(it->path().filename().string(), ".orvane-tmp-")) found.push_back(it->path().string());
    return found;
}

TEST(CliRender, WritesEveryFrameAndReportsIt) {
    TempDir dir;
    fs::create_directories(dir.Path() / "out");
    // Temporaries left by a killed render on another machine, untouched for two hours: the render's own go,
    // another output's stay.
    const fs::path stale = dir.Path() / "out/.f.0002.png.orvane-tmp-farm7-4242";
    const fs::path other = dir.Path() / "out/.g.0002.png.orvane-tmp-farm7-4242";
    for (const fs::path &p : {stale, other}) {
        std::ofstream(p) << "half a frame";
        fs::last_write_time(p, fs::file_time_type::clock::now() - std::chrono::hours(2));
    }
    const auto flow = dir.File("a.flow", GradientFlow(dir.Path()));
    const CliRun r = Render(flow, " --frames 3,1-2");
    EXPECT_FALSE(fs::exists(stale));
    EXPECT_TRUE(fs::exists(other));
    EXPECT_EQ(r.exitCode, 0) << r.err;
    EXPECT_TRUE(Starts(r.out, "RENDER saver=Out files=" + (dir.Path() / "out/f.####.png").string() +
                                  " frames=1-3 format=PNGFormat\n"));
    EXPECT_TRUE(Has(r.out, "FRAME 3 done 1/3 saver=Out file=" + (dir.Path() / "out/f.0003.png").string() + " "));
    EXPECT_TRUE(Has(r.out, "FRAME 2 done 3/3 saver=Out"));
    EXPECT_TRUE(Has(r.out, "SUMMARY written=3 failed=0 skipped=0"));
    for (const char *f : {"f.0001.png", "f.0002.png", "f.0003.png"}) EXPECT_TRUE(fs::exists(dir.Path() / "out" / f));

    // Existing files are left alone with --skip-existing; JSON lines say so. (--allow-scripts is accepted.)
    const auto before = fs::last_write_time(dir.Path() / "out/f.0001.png");
    const CliRun again = Render(flow, " --skip-existing --allow-scripts --log-format json");
    EXPECT_EQ(again.exitCode, 0) << again.err;
    EXPECT_TRUE(Has(again.out, "{\"event\": \"render\", \"saver\": \"Out\", \"files\": \"" +
                                   (dir.Path() / "out/f.####.png").string() +
                                   "\", \"frames\": \"1-3\", \"format\": \"PNGFormat\"}\n"));
    EXPECT_TRUE(Has(again.out, "{\"event\": \"frame\", \"frame\": 1, \"status\": \"skipped\""));
    EXPECT_TRUE(Has(again.out, "\"event\": \"summary\", \"written\": 0, \"failed\": 0, \"skipped\": 3"));
    EXPECT_EQ(fs::last_write_time(dir.Path() / "out/f.0001.png"), before);
}

TEST(CliRender, NamesAreNumberedForSeveralFramesAndEventsCarryTheirFactsInFields) {
    TempDir dir;
    const auto flow = dir.File("a.flow", SaverFlow({{"Out", (dir.Path() / "still.png").string(), ""}}));
    const struct {
        const char *frames, *files, *lastFile;
    } cases[] = {
        {"5", "still.png", "still.png"},
        {"1-3", "still.####.png", "still.0003.png"},
        {"1-2 --chunk 2/2", "still.####.png", "still.0002.png"}, // a chunk numbers as its whole range
    };
    for (const auto &c : cases) {
        const CliRun r = Render(flow, std::string(" --frames ") + c.frames);
        EXPECT_EQ(r.exitCode, 0) << r.err;
        EXPECT_TRUE(Has(r.out, "files=" + (dir.Path() / c.files).string() + " "));
        EXPECT_TRUE(fs::exists(dir.Path() / c.lastFile)) << c.frames;
    }
    // Events carry their facts in fields: an Output Format not the extension's writes, with a warning naming both.
    const auto formats =
        dir.File("b.flow", SaverFlow({{"Out", (dir.Path() / "f.####.png").string(),
                                       ", OutputFormat = \"TargaFormat\", SoundFilename = \"a.wav\""}}));
    const CliRun text = Render(formats, " --frames 1");
    EXPECT_EQ(text.exitCode, 0) << text.err;
    const std::string warning = "WARNING: saver=Out format=TargaFormat extension=.png: ";
    EXPECT_TRUE(Has(text.err, warning) && text.err.find(warning) == text.err.rfind(warning));
    EXPECT_NE(ReadFile(dir.Path() / "f.0001.png").substr(1, 3), "PNG");
    const CliRun json = Render(formats, " --frames 1 --log-format json");
    EXPECT_TRUE(Has(json.out, "{\"event\": \"warning\", \"code\": \"format_mismatch\", \"saver\": \"Out\", "
                              "\"format\": \"TargaFormat\", \"extension\": \"png\", \"extension_format\": "
                              "\"PNGFormat\", \"warning\": "));
    // A tool's console line says which tool it came from.
    EXPECT_TRUE(Has(json.out, "{\"event\": \"warning\", \"code\": \"tool\", \"frame\": 1, \"saver\": \"Out\", "
                              "\"tool\": \"Out\", \"warning\": \"Warning: Out: No supported audio found in a.wav\"}"));
    EXPECT_TRUE(json.err.empty()) << json.err;
}

TEST(CliRender, RefusesBeforeTheFirstFrameToWriteOneFileTwice) {
    TempDir dir;
    const fs::path out = dir.Path() / "out";
    fs::create_directories(out);
    fs::create_directory_symlink(out, dir.Path() / "link");
    const struct {
        std::string a, b, args, message;
    } cases[] = {
        {(out / "f.####.png").string(), (out / "f.%04d.png").string(), "",
         "ERROR: Savers A (frame 1) and B (frame 1) would both write " + (out / "f.0001.png").string() +
             " (and 2 more like it); nothing was written\n"},
        {(out / "one.png").string(), (out / "one.png").string(), " --frames 2",
         "ERROR: Savers A (frame 2) and B (frame 2) would both write " + (out / "one.png").string() +
             "; nothing was written\n"},
        {(out / "f.####.png").string(), (dir.Path() / "link/f.$F4.png").string(), " --frames 7",
         "ERROR: Savers A (frame 7) and B (frame 7) would both write " + (dir.Path() / "link/f.0007.png").string()},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.b);
        const auto flow = dir.File("a.flow", SaverFlow({{"A", c.a, ""}, {"B", c.b, ""}}));
        const CliRun r = Render(flow, c.args);
        EXPECT_EQ(r.exitCode, 2);
        EXPECT_TRUE(Has(r.err, c.message));
        EXPECT_FALSE(Contains(r.out, "FRAME")) << r.out;
        EXPECT_TRUE(fs::is_empty(out)) << "nothing is written";
    }
    // In JSON the Savers, frames and the file are fields.
    const auto flow = dir.File("a.flow", SaverFlow({{"A", cases[1].a, ""}, {"B", cases[1].b, ""}}));
    const CliRun json = Render(flow, " --frames 2 --log-format json");
    EXPECT_EQ(json.exitCode, 2);
    EXPECT_TRUE(Starts(json.out,
                       "{\"event\": \"error\", \"code\": \"same_file\", \"saver\": \"A\", \"frame\": 2, \"file\": \"" +
                           cases[1].a + "\", \"count\": 1, \"other_saver\": \"B\", \"other_frame\": 2, \"error\": "));
}

TEST(CliRender, ChunksOfARangeWriteTheSameBytesAsTheWholeRange) {
    TempDir whole, parts;
    const std::string relative = ", SetSequenceStart = 1, SequenceStartFrame = 1001";
    const auto flowWhole = whole.File("a.flow", GradientFlow(whole.Path(), relative));
    const auto flowParts = parts.File("a.flow", GradientFlow(parts.Path(), relative));
    ASSERT_EQ(Render(flowWhole, " --frames 10-14").exitCode, 0);
    for (const char *chunk : {"1/2", "2/2"})
        ASSERT_EQ(Render(flowParts, std::string(" --frames 10-14 --chunk ") + chunk).exitCode, 0);
    for (int n = 1001; n <= 1005; ++n) {
        const std::string name = "out/f." + std::to_string(n) + ".png";
        const std::string a = ReadFile(whole.Path() / name), b = ReadFile(parts.Path() / name);
        EXPECT_TRUE(!a.empty() && a == b) << name;
    }
}

TEST(CliRender, TheOpenCLDeviceWritesTheSameFilesAsTheCPU) {
    // Four-corner ramps graded by a gamma and a linear chain: kernels that do the rows' float arithmetic (the gamma
    // rounds to 16 bits, hiding the powers' last bits) must give byte-identical files.
    TempDir cpuDir, devDir;
    auto flow = [](const fs::path &dir) {
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
    const CliRun cpu = Render(cpuFlow, " --device cpu");
    ASSERT_EQ(cpu.exitCode, 0) << cpu.err;
    const CliRun dev = Render(devFlow, " --device opencl");
    if (dev.exitCode == 2 && Contains(dev.err, "--device opencl")) {
        const char *required = std::getenv("ORVANE_REQUIRE_DEVICE");
        if (required && std::string(required) == "opencl") FAIL() << dev.err;
        GTEST_SKIP() << dev.err;
    }
    ASSERT_EQ(dev.exitCode, 0) << dev.err;
    EXPECT_FALSE(Contains(dev.out + dev.err, "device:")) << "a device run failed: " << dev.out << dev.err;
    for (const char *name : {"out/f.0001.png", "out/f.0002.png"}) {
        const std::string a = ReadFile(cpuDir.Path() / name), b = ReadFile(devDir.Path() / name);
        EXPECT_TRUE(!a.empty() && a == b) << name;
    }
    const CliRun bad = Orvane("eval " + Quote(cpuFlow.string()) + " BC --device quantum");
    EXPECT_EQ(bad.exitCode, 2);
    EXPECT_TRUE(Has(bad.err, "--device is cpu, auto, opencl or cuda"));
}

TEST(CliRender, BadRequestsAndFailedFramesHaveTheirExitCodes) {
    TempDir dir;
    const auto flow = dir.File("a.flow", GradientFlow(dir.Path()));
    const fs::path pipe = dir.Path() / "pipe.png";
    ASSERT_EQ(mkfifo(pipe.c_str(), 0600), 0);
    const auto big = dir.File("big.flow", "Orvane.Document { Version = 1, RenderRange = { 0, 0 }, Tools = {\n"
                                          "Bg = Background { Inputs = { Width = 1024, Height = 1024, Depth = 4 } },\n"
                                          "Blur1 = Blur { Inputs = { XBlurSize = 4, Input = Bg.Output } },\n"
                                          "Out = Saver { Inputs = { Clip = \"" +
                                              (dir.Path() / "big.raw").string() + "\", Input = Blur1.Output } } } }");
    const struct {
        fs::path flow;
        const char *args;
        int exitCode;
        std::string message;
    } bad[] = {
        {flow, " --frames 1-x", 2, ""},
        {flow, " --saver Bg", 2, ""},
        {flow, " --memory-limit lots", 2, ""},
        {flow, " --chunk 3/2", 2, ""},
        {dir.File("none.flow", "Orvane.Document { Version = 1, Tools = { Bg = Background {} } }\n"), "", 2,
         "has no Saver"},
        {dir.File("nameless.flow", SaverFlow({{"Out", "", ""}})), "", 2,
         "ERROR: Saver Out has no file name to write to"},
        // Only regular files are replaced.
        {dir.File("pipe.flow", SaverFlow({{"Out", pipe.string(), ""}})), " --frames 1", 2,
         "ERROR: Saver Out, frame 1: " + pipe.string() +
             ": a FIFO, not a regular file; refusing to write over it; nothing was written"},
        // A folder that does not exist fails each frame, naming the file once.
        {dir.File("c.flow", SaverFlow({{"Out", (dir.Path() / "none/x.####.png").string(), ""}})), " --frames 4", 3,
         "ERROR: frame 4 saver=Out: Out failed to write " + (dir.Path() / "none/x.0004.png").string() +
             ": the folder does not exist\n"},
        // A FIFO in place of a file fails its frame at once; --memory-limit bounds a render's images (a 1024 x
        // 1024 frame and its blur need 16 MiB each) and says what a tool needed.
        {dir.File("fifo.flow", CopyFlow(dir.Path(), "", "", pipe)), " --frames 1", 3,
         "In failed to load file \"" + pipe.string() + "\" : is not a regular file (a FIFO)"},
        {big, " --memory-limit 8M", 3,
         "ERROR: frame 0 saver=Out: Bg: needs 16 MiB for a 1024x1024 RGBA float32 image; --memory-limit is 8 MiB"},
        {big, " --memory-limit 40M", 0, ""},
    };
    for (const auto &b : bad) {
        const CliRun r = Render(b.flow, b.args);
        EXPECT_EQ(r.exitCode, b.exitCode) << b.flow << b.args;
        EXPECT_TRUE(Has(r.err, b.message));
    }
    EXPECT_TRUE(fs::is_fifo(pipe));
    const CliRun info = Orvane("info " + Quote(pipe.string()));
    EXPECT_EQ(info.exitCode, 3);
    EXPECT_EQ(info.out + info.err, "ERROR: " + pipe.string() + " is not a regular file (a FIFO)\n");

    // A Loader whose frame 2 is missing: that frame fails, the others are written.
    ASSERT_EQ(Render(flow, " --frames 1,3").exitCode, 0);
    const auto chain = dir.File("b.flow", CopyFlow(dir.Path(), ", RenderRange = { 1, 3 }", ""));
    const CliRun failed = Render(chain);
    EXPECT_EQ(failed.exitCode, 3) << failed.out << failed.err;
    EXPECT_TRUE(Has(failed.err, "ERROR: frame 2 saver=Out: In failed to load file"));
    EXPECT_TRUE(Has(failed.out, "SUMMARY written=2 failed=1"));
    EXPECT_TRUE(Has(failed.out, "FAILED saver=Out frames=2"));
    EXPECT_TRUE(fs::exists(dir.Path() / "copy/c.0003.tga"));
    EXPECT_FALSE(fs::exists(dir.Path() / "copy/c.0002.tga"));
    // In JSON the failed frame names the tool that failed and the file it was for.
    const CliRun json = Render(chain, " --frames 2 --log-format json");
    EXPECT_TRUE(Has(json.out, "{\"event\": \"error\", \"code\": \"frame_failed\", \"frame\": 2, \"saver\": "
                              "\"Out\", \"tool\": \"In\", \"file\": \"" +
                                  (dir.Path() / "copy/c.0002.tga").string() +
                                  "\", \"error\": \"frame 2 saver=Out: In failed to load file"));
}

TEST(CliRender, ASecondSignalStillListsTheFilesWritten) {
    TempDir dir;
    const auto flow = dir.File("a.flow", GradientFlow(dir.Path()));
    ASSERT_EQ(Render(flow, " --frames 1").exitCode, 0);
    // Frame 2 of the Loader's clip never arrives: "Wait" holds the render there.
    const auto chain =
        dir.File("b.flow", CopyFlow(dir.Path(), "", ", GlobalOut = 3, ClipTimeEnd = 2, MissingFrames = 3"));
    const std::string file = (dir.Path() / "copy/c.0001.tga").string();
    const struct {
        int signal;
        const char *format, *frameDone;
        std::string listed;
    } cases[] = {
        {SIGINT, "text", "FRAME 1 done", "WRITTEN saver=Out frames=1\n  " + file + "\n"},
        {SIGTERM, "json", "\"status\": \"done\"", "\"written_files\": {\"Out\": [\"" + file + "\"]}"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.format);
        const auto outFile = dir.Path() / "render.out";
        fs::remove(outFile);
        const pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) {
            std::freopen(outFile.c_str(), "w", stdout);
            std::freopen((dir.Path() / "render.err").c_str(), "w", stderr);
            const std::string exe = std::string(ORVANE_BINARY_DIR) + "/orvane";
            execl(exe.c_str(), exe.c_str(), "render", chain.c_str(), "--frames", "1-3", "--log-format", c.format,
                  static_cast<char *>(nullptr));
            _exit(127);
        }
        // Wait until frame 1 is reported, then signal twice: the second abandons the waiting frame.
        for (int i = 0; i < 200 && !Contains(ReadFile(outFile), c.frameDone); ++i) usleep(50000);
        kill(pid, c.signal);
        usleep(200000);
        kill(pid, c.signal);
        int status = 0;
        waitpid(pid, &status, 0);
        ASSERT_TRUE(WIFEXITED(status));
        EXPECT_EQ(WEXITSTATUS(status), 130);
        EXPECT_TRUE(Contains(ReadFile(outFile), c.listed)) << ReadFile(outFile);
        EXPECT_TRUE(fs::exists(file));
        EXPECT_FALSE(fs::exists(dir.Path() / "copy/c.0002.tga"));
        EXPECT_TRUE(Temporaries(dir.Path() / "copy").empty());
    }
}

} // namespace
} // namespace Orvane::clitest
