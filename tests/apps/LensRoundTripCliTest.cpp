// The lens example (examples/lens-roundtrip.flow) from the command line: lens data loaded into a tool with
// orvane set (a bad file changes nothing), then the render: the plate distorted back from its undistorted self
// matches the plate away from the frame's edge, and the comp carries the card.
#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>

#include "host/image/Image.h"
#include "tests/apps/CliRun.h"
#include "tests/support/TestSupport.h"

namespace Orvane::clitest::lensroundtrip {
namespace {

namespace fs = std::filesystem;

TEST(LensRoundTripExample, LoadsLensDataAndReturnsThePlate) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    const fs::path flow = dir.Path() / "lens-roundtrip.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/lens-roundtrip.flow", flow);
    fs::create_directory(dir.Path() / "lens");
    const fs::path data = dir.Path() / "lens/shot-radial.data";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/lens/shot-radial.data", data);
    const std::string f = Quote(flow.string());

    // Clear a coefficient and the shift, load the file again: the document is as it came.
    const std::string original = ReadFile(flow);
    ASSERT_EQ(
        Orvane("set " + f + " Undistort.DE4RadialStandardDegree4.DistortionDegree2=0 Undistort.LensShiftX=0").exitCode,
        0);
    ASSERT_NE(ReadFile(flow), original);
    CliRun r = Orvane("set " + f + " Undistort.Load=" + Quote(data.string()));
    ASSERT_EQ(r.exitCode, 0) << r.err;
    EXPECT_EQ(ReadFile(flow), original);
    // A file with an unknown parameter: exit 3, the message names the file and the parameter, nothing saved.
    const fs::path bad = dir.File("bad.data", "Distortion - Degree 2\n-0.3\nno such parameter 1\n");
    r = Orvane("set " + f + " Undistort.Load=" + Quote(bad.string()));
    EXPECT_EQ(r.exitCode, 3);
    EXPECT_NE(r.err.find("bad.data\": ldpk::error: undefined parameter 'no such parameter 1' at line 3"),
              std::string::npos)
        << r.err;
    EXPECT_EQ(ReadFile(flow), original);

    r = Orvane("render " + f + " --frames 1");
    ASSERT_EQ(r.exitCode, 0) << r.out << r.err;
    const Ref<Image> plate = ReadFrame(dir.Path() / "out/lens/plate.0001.exr");
    const Ref<Image> back = ReadFrame(dir.Path() / "out/lens/roundtrip.0001.exr");
    const Ref<Image> comp = ReadFrame(dir.Path() / "out/lens/comp.0001.exr");
    ASSERT_TRUE(plate && back && comp);
    // The texture changes by at most about 0.015 per pixel, so 1e-3 is under a tenth of a pixel of movement.
    double worst = 0;
    for (int y = 40; y < 500; ++y)
        for (int x = 40; x < 920; ++x) {
            const FltPixel a = plate->GetFlt(x, y), b = back->GetFlt(x, y);
            worst = std::max(
                {worst, double(std::fabs(a.R - b.R)), double(std::fabs(a.G - b.G)), double(std::fabs(a.B - b.B))});
        }
    EXPECT_LT(worst, 1e-3);
    // The card's middle (0.62, 0.45 of the undistorted frame) lands near there in the comp: its orange.
    const FltPixel card = comp->GetFlt(595, 243);
    EXPECT_NEAR(card.R, 0.9f, 1e-3);
    EXPECT_NEAR(card.G, 0.3f, 1e-3);
    EXPECT_NEAR(card.B, 0.1f, 1e-3);
}

} // namespace
} // namespace Orvane::clitest::lensroundtrip
