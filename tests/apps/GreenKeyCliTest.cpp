// The keying example (examples/green-key.flow) from the command line: the screen colour and the Ultra Keyer's
// ranges picked over bare screen, and both keyers' composites rendered on the CPU and on OpenCL alike, with the
// actor kept, the screen replaced by the new background and the stand taken out by the garbage mask. The plate and
// the new background are evaluated in process from the same document, so what is checked is what the keys did.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <filesystem>

#include "host/flow/DocumentIO.h"
#include "host/flow/InputValue.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "host/media/Clip.h"
#include "tests/apps/CliRun.h"
#include "tests/support/TestSupport.h"

namespace Orvane::clitest::greenkey {
namespace {

namespace fs = std::filesystem;

Ref<OrvaneDoc> Load(const fs::path &flow) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    EXPECT_TRUE(LoadDocument(ReadFile(flow), *doc).ok) << flow;
    return doc;
}

double Value(OrvaneDoc &doc, const char *tool, const char *input) {
    const Ref<Parameter> v = doc.FindTool(tool)->FindInput(input)->ValueAt(1.0);
    const auto *n = dynamic_cast<const Number *>(v.Get());
    return n ? n->value : NAN;
}

class GreenKey : public ::testing::Test {
protected:
    void SetUp() override {
        Orvane::Test::LoadOperators();
        flow_ = dir_.Path() / "green-key.flow";
        fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/green-key.flow", flow_);
    }
    TempDir dir_;
    fs::path flow_;
};

TEST_F(GreenKey, PicksTheScreenColourAndTheRangesOverBareScreen) {
    ASSERT_EQ(Orvane("set " + Quote(flow_.string()) + " DK.BackgroundRed=0.5 DK.BackgroundGreen=0.5").exitCode, 0);
    const CliRun colour = Orvane("pick " + Quote(flow_.string()) + " DK.Background 20,20,60,60");
    ASSERT_EQ(colour.exitCode, 0) << colour.out << colour.err;
    const CliRun ranges = Orvane("pick " + Quote(flow_.string()) + " UK 20,20,60,60");
    ASSERT_EQ(ranges.exitCode, 0) << ranges.out << ranges.err;
    EXPECT_TRUE(Has(ranges.out, "UltraKeyer Pick"));

    // The patch's pixels from the plate in process: their mean is the screen colour; their chroma axes (and
    // luminance) bound the picked ranges, each widened by 2^-15.
    Ref<OrvaneDoc> doc = Load(flow_);
    const Ref<Image> plate = Orvane::Test::EvalImage(doc->FindTool("Rig"), 1.0);
    ASSERT_TRUE(plate);
    double sum[3] = {0, 0, 0}, lo[4], hi[4];
    std::fill(lo, lo + 4, HUGE_VAL), std::fill(hi, hi + 4, -HUGE_VAL);
    for (int y = 20; y <= 60; ++y)
        for (int x = 20; x <= 60; ++x) {
            const FltPixel p = plate->GetFlt(x, y);
            sum[0] += p.R, sum[1] += p.G, sum[2] += p.B;
            const double lum = 0.299 * p.R + 0.587 * p.G + 0.114 * p.B;
            const double axes[4] = {(p.R - lum) * 0.61035 + 0.5, (p.G - lum) * 0.76294 + 0.5,
                                    (p.B - lum) * 0.45776 + 0.5, lum};
            for (int i = 0; i < 4; ++i) lo[i] = std::min(lo[i], axes[i]), hi[i] = std::max(hi[i], axes[i]);
        }
    const char *channels[3] = {"BackgroundRed", "BackgroundGreen", "BackgroundBlue"};
    for (int c = 0; c < 3; ++c) EXPECT_NEAR(Value(*doc, "DK", channels[c]), sum[c] / (41 * 41), 1e-6) << channels[c];
    const char *axes[4] = {"Red", "Green", "Blue", "Luminance"};
    for (int i = 0; i < 4; ++i) {
        EXPECT_NEAR(Value(*doc, "UK", (std::string(axes[i]) + "Low").c_str()), lo[i] - 3.0517578e-5, 2e-6) << axes[i];
        EXPECT_NEAR(Value(*doc, "UK", (std::string(axes[i]) + "High").c_str()), hi[i] + 3.0517578e-5, 2e-6) << axes[i];
    }
}

TEST_F(GreenKey, KeysOverTheNewBackgroundAndOpenCLRendersTheSame) {
    TempDir cpuDir, devDir;
    fs::copy_file(flow_, cpuDir.Path() / "green-key.flow");
    fs::copy_file(flow_, devDir.Path() / "green-key.flow");
    const CliRun cpu = Orvane("render " + Quote((cpuDir.Path() / "green-key.flow").string()) + " --device cpu");
    ASSERT_EQ(cpu.exitCode, 0) << cpu.out << cpu.err;
    const CliRun dev = Orvane("render " + Quote((devDir.Path() / "green-key.flow").string()) + " --device opencl");
    const bool haveDevice = !(dev.exitCode == 2 && Contains(dev.err, "--device opencl"));
    if (!haveDevice) {
        const char *required = std::getenv("ORVANE_REQUIRE_DEVICE");
        if (required && std::string(required) == "opencl") FAIL() << dev.err;
    } else {
        ASSERT_EQ(dev.exitCode, 0) << dev.out << dev.err;
        EXPECT_FALSE(Contains(dev.out + dev.err, "device:")) << "a device run failed: " << dev.out << dev.err;
    }

    Ref<OrvaneDoc> doc = Load(flow_);
    const Ref<Image> back = Orvane::Test::EvalImage(doc->FindTool("NewBack"), 1.0);
    ASSERT_TRUE(back);
    for (const char *name : {"out/key/delta.0001.exr", "out/key/ultra.0001.exr"}) {
        const Ref<Image> comp = ReadFrame(cpuDir.Path() / name);
        ASSERT_TRUE(comp) << name;
        // The actor's middle is its own colour; bare screen and the stand behind the garbage mask show the new
        // background (the screen's grain-free gradient keys to within 0.02).
        const FltPixel middle = comp->GetFlt(160, 90);
        EXPECT_NEAR(middle.R, 0.75, 1e-5) << name;
        EXPECT_NEAR(middle.G, 0.5, 1e-5) << name;
        EXPECT_NEAR(middle.B, 0.38, 1e-5) << name;
        double screen = 0, stand = 0;
        for (int y = 5; y < 175; y += 5) {
            for (int x : {10, 40, 80, 250}) {
                const FltPixel a = comp->GetFlt(x, y), b = back->GetFlt(x, y);
                screen = std::max({screen, double(std::fabs(a.R - b.R)), double(std::fabs(a.G - b.G))});
            }
            const FltPixel a = comp->GetFlt(298, y), b = back->GetFlt(298, y);
            stand = std::max({stand, double(std::fabs(a.R - b.R)), double(std::fabs(a.G - b.G))});
        }
        EXPECT_LE(screen, 0.02) << name;
        EXPECT_LE(stand, 1e-6) << name;
        if (!haveDevice) continue;
        const Ref<Image> onDevice = ReadFrame(devDir.Path() / name);
        ASSERT_TRUE(onDevice) << name;
        double worst = 0;
        for (int y = 0; y < 180; ++y)
            for (int x = 0; x < 320; ++x) {
                const FltPixel a = comp->GetFlt(x, y), b = onDevice->GetFlt(x, y);
                worst = std::max({worst, double(std::fabs(a.R - b.R)), double(std::fabs(a.G - b.G)),
                                  double(std::fabs(a.B - b.B)), double(std::fabs(a.A - b.A))});
            }
        EXPECT_LE(worst, 1e-5) << name << ": OpenCL against the CPU";
    }
}

} // namespace
} // namespace Orvane::clitest::greenkey
