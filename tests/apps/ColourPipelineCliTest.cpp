// The colour pipeline example (examples/colour-pipeline.flow) rendered the way scripts/run-examples.sh renders it:
// the log plate it makes, the graded frame against the chain worked out here from its formulas (log curve, range
// correction, show LUT), the OpenCL device against the CPU, and a missing LUT that must not replace a good frame.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>

#include "host/image/Image.h"
#include "host/media/Clip.h"
#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

namespace fs = std::filesystem;

const fs::path kExamples = fs::path(ORVANE_SOURCE_DIR) / "examples";

// Printing density with black at code 95 and white at 685 of 1023, film gamma 0.6 (300 codes a decade), black
// taken to 0: linear light of a code value v (0..1), and back.
const double kBlackOffset = std::pow(10.0, (95.0 - 685.0) / 300.0);
double LogToLinear(double v) {
    return (std::pow(10.0, (v * 1023.0 - 685.0) / 300.0) - kBlackOffset) / (1.0 - kBlackOffset);
}
double LinearToLog(double x) { return (685.0 + 300.0 * std::log10(x * (1.0 - kBlackOffset) + kBlackOffset)) / 1023.0; }

/// The flow's Color Corrector on grey linear light x, channel c (0 red .. 2 blue). The Simple range curves weigh
/// shadows 1 - 2L and highlights 2L - 1 (L = x for grey), read at the nearest of 1024 samples over 0..1. Shadows:
/// gain 0.92 in red, lift 0.01 (0.025 in blue), x (gain - lift) + lift; highlights: x^(1 / 1.1), then gain 1.12
/// (times 0.94 in blue); midtones unchanged.
double Corrected(double x, int c) {
    const double l = std::round(std::clamp(x, 0.0, 1.0) * 1023.0) / 1023.0;
    const double shadows = std::max(0.0, 1.0 - 2.0 * l), highlights = std::max(0.0, 2.0 * l - 1.0);
    const double gain = c == 0 ? 0.92 : 1.0, lift = c == 2 ? 0.025 : 0.01;
    const double lows = x * (gain - lift) + lift;
    const double highs = std::pow(x, 1.0 / 1.1) * (c == 2 ? 1.12 * 0.94 : 1.12);
    return shadows * lows + (1.0 - shadows - highlights) * x + highlights * highs;
}

/// The show LUT (examples/show-look.cube): f(x) = x (1 + x/4) / (1 + x) at 17 rows over 0..2, read linearly
/// between rows, clamped outside.
double ShowLook(double x) {
    auto f = [](double v) { return v * (1.0 + v / 4.0) / (1.0 + v); };
    const double t = std::clamp(x, 0.0, 2.0) * 8.0;
    const int i = std::min(static_cast<int>(t), 15);
    return f(i / 8.0) + (t - i) * (f((i + 1) / 8.0) - f(i / 8.0));
}

/// Copies the example into `dir` and runs each of its "-- orvane-render:" lines in turn with `more` options; the
/// first run that fails, else the last.
CliRun RenderExample(const fs::path &dir, const std::string &more) {
    for (const char *name : {"colour-pipeline.flow", "show-look.cube"})
        fs::copy_file(kExamples / name, dir / name, fs::copy_options::overwrite_existing);
    std::istringstream lines(ReadFile(dir / "colour-pipeline.flow"));
    const std::string marker = "-- orvane-render:";
    CliRun r;
    for (std::string line; std::getline(lines, line);) {
        if (line.rfind(marker, 0) != 0) continue;
        r = Orvane("render " + Quote((dir / "colour-pipeline.flow").string()) + line.substr(marker.size()) + more);
        if (r.exitCode != 0) return r;
    }
    return r;
}

/// The largest channel difference between `a` and `want(x, y, channel)` over a's data window, with where it is.
struct Worst {
    double diff = 0.0;
    std::string where;
};
Worst Compare(const Image &a, const std::function<double(int, int, int)> &want) {
    Worst w;
    const ImgRectI dw = a.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const FltPixel p = a.GetFlt(x, y);
            const float got[4] = {p.R, p.G, p.B, p.A};
            for (int c = 0; c < 4; ++c)
                if (const double d = std::fabs(got[c] - want(x, y, c)); !(d <= w.diff))
                    w = {d, std::to_string(x) + "," + std::to_string(y) + " channel " + std::to_string(c) + " got " +
                                std::to_string(got[c]) + " want " + std::to_string(want(x, y, c))};
        }
    return w;
}

class ColourPipeline : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

TEST_F(ColourPipeline, TheGradedFrameFollowsTheLogCurveTheCorrectionAndTheLUT) {
    TempDir dir;
    const CliRun r = RenderExample(dir.Path(), " --device cpu");
    ASSERT_EQ(r.exitCode, 0) << r.out << r.err;
    const Ref<Image> plate = ReadFrame(dir.Path() / "out/colour/log-plate.0001.png"),
                     graded = ReadFrame(dir.Path() / "out/colour/graded.0001.exr");
    ASSERT_TRUE(plate && graded);
    ASSERT_FALSE(plate->IsFloat()) << "the plate is 16-bit codes";
    ASSERT_TRUE(graded->IsFloat());
    ASSERT_EQ(plate->DataWindow(), ImgRectI(0, 0, 256, 16));
    ASSERT_EQ(graded->DataWindow(), plate->DataWindow());

    // The plate: the wedge 1.5 x / 255 in log codes, stored as the nearest 16-bit code (the float values on the way
    // may tip a value that lies on a half code, and the code read back as float is rounded once more).
    const Worst encoded =
        Compare(*plate, [](int x, int, int c) { return c == 3 ? 1.0 : LinearToLog(1.5 * x / 255.0); });
    EXPECT_LE(encoded.diff, 0.51 / 65535.0) << encoded.where;

    // The graded frame from the plate's own codes: 5e-7 at most on the build machine, where float rounding and the
    // transform's fast powers (within about 2e-5 relative of the curve's) leave room for other vector units.
    const Worst chain = Compare(*graded, [&](int x, int y, int c) {
        if (c == 3) return 1.0;
        const FltPixel code = plate->GetFlt(x, y);
        return ShowLook(Corrected(LogToLinear(code.R), c));
    });
    EXPECT_LE(chain.diff, 1e-5) << chain.where;

    // The wedge reaches both ranges: black lifted towards blue, the top warmed (blue held back).
    const FltPixel black = graded->GetFlt(0, 0), top = graded->GetFlt(255, 0);
    EXPECT_GT(black.B, black.R + 0.01f);
    EXPECT_LT(top.B, top.R - 0.02f);
}

TEST_F(ColourPipeline, OpenCLWritesTheSameFramesAsTheCPU) {
    TempDir cpuDir, devDir;
    const CliRun cpu = RenderExample(cpuDir.Path(), " --device cpu");
    ASSERT_EQ(cpu.exitCode, 0) << cpu.out << cpu.err;
    const CliRun dev = RenderExample(devDir.Path(), " --device opencl");
    if (dev.exitCode == 2 && Contains(dev.err, "--device opencl")) {
        const char *required = std::getenv("ORVANE_REQUIRE_DEVICE");
        if (required && std::string(required) == "opencl") FAIL() << dev.err;
        GTEST_SKIP() << dev.err;
    }
    ASSERT_EQ(dev.exitCode, 0) << dev.out << dev.err;
    EXPECT_FALSE(Contains(dev.out + dev.err, "device:")) << "a device run failed: " << dev.out << dev.err;

    // The kernels do the rows' arithmetic; only the highlights' gamma power (the device's powf against the rows'
    // vectorised power) may differ, by float rounding: a float step or two (1.2e-7 measured).
    for (const char *name : {"out/colour/log-plate.0001.png", "out/colour/graded.0001.exr"}) {
        const Ref<Image> a = ReadFrame(cpuDir.Path() / name), b = ReadFrame(devDir.Path() / name);
        ASSERT_TRUE(a && b) << name;
        ASSERT_EQ(a->DataWindow(), b->DataWindow()) << name;
        const Worst w = Compare(*b, [&](int x, int y, int c) {
            const FltPixel p = a->GetFlt(x, y);
            return c == 0 ? p.R : c == 1 ? p.G : c == 2 ? p.B : p.A;
        });
        EXPECT_LE(w.diff, 1e-6) << name << ": " << w.where;
    }
}

TEST_F(ColourPipeline, AMissingLUTFailsTheFrameAndKeepsTheGoodOne) {
    TempDir dir;
    ASSERT_EQ(RenderExample(dir.Path(), "").exitCode, 0);
    const fs::path exr = dir.Path() / "out/colour/graded.0001.exr";
    const std::string good = ReadFile(exr);
    const CliRun r = Orvane("render " + Quote((dir.Path() / "colour-pipeline.flow").string()) +
                            " --saver Graded --set Look.LUTFile=gone.cube");
    EXPECT_EQ(r.exitCode, 3);
    EXPECT_TRUE(Has(r.out + r.err, "Look: cannot read LUT file '" + (dir.Path() / "gone.cube").string() + "'"));
    EXPECT_EQ(ReadFile(exr), good);
}

} // namespace
} // namespace Orvane::clitest
