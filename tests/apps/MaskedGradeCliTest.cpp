// The masks example (examples/masked-grade.flow) rendered from the command line: inside the animated polygon and
// the ellipse the plate is graded by the corrector's gains exactly, outside the polygon it is untouched, and outside
// the ellipse the card's hard edge is blurred. The plate before the masks is evaluated in process from the same
// document, so what is checked is what the masks did.
#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>

#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "host/media/Clip.h"
#include "tests/apps/CliRun.h"
#include "tests/support/TestSupport.h"

namespace Orvane::clitest::maskedgrade {
namespace {

namespace fs = std::filesystem;

/// Where the vignette ellipse (centre (160, 90), radii 120 and 72 pixels) leaves the plate sharp: well inside it,
/// beyond the reach of its soft edge.
bool Sharp(int x, int y) { return std::pow((x + 0.5 - 160) / 120, 2) + std::pow((y + 0.5 - 90) / 72, 2) < 0.3; }

TEST(MaskedGradeExample, GradesInsideTheMovingPolygonAndBlursOutsideTheEllipse) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    const fs::path flow = dir.Path() / "masked-grade.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/masked-grade.flow", flow);
    const CliRun r = Orvane("render " + Quote(flow.string()) + " --frames 1-12");
    ASSERT_EQ(r.exitCode, 0) << r.out << r.err;
    for (int f = 1; f <= 12; ++f)
        EXPECT_TRUE(fs::exists(dir.Path() /
                               ("out/masks/graded.00" + std::string(f < 10 ? "0" : "") + std::to_string(f) + ".exr")));

    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(ReadFile(flow), *doc).ok);
    const Ref<Image> lift = Orvane::Test::EvalImage(doc->FindTool("Lift"), 1.0);
    const Ref<Image> first = ReadFrame(dir.Path() / "out/masks/graded.0001.exr"),
                     last = ReadFrame(dir.Path() / "out/masks/graded.0012.exr");
    ASSERT_TRUE(lift && first && last);

    // Frame 1: the polygon covers (130, 90) well inside its soft edge: the corrector's gains, Master RGB 1.3 times
    // Master Red 1.15 and Master Blue 0.85.
    const FltPixel in = lift->GetFlt(130, 90), graded = first->GetFlt(130, 90);
    EXPECT_NEAR(graded.R, in.R * 1.3 * 1.15, 1e-5);
    EXPECT_NEAR(graded.G, in.G * 1.3, 1e-5);
    EXPECT_NEAR(graded.B, in.B * 1.3 * 0.85, 1e-5);
    // Frame 12: the polygon has moved to the right third; what is left of it and sharp is the plate itself.
    int untouched = 0;
    for (int y = 0; y < 180; ++y)
        for (int x = 0; x < 170; ++x)
            if (Sharp(x, y)) {
                const FltPixel a = last->GetFlt(x, y), b = lift->GetFlt(x, y);
                ASSERT_NEAR(a.R, b.R, 1e-6) << x << "," << y;
                ASSERT_NEAR(a.B, b.B, 1e-6) << x << "," << y;
                ++untouched;
            }
    EXPECT_GT(untouched, 3000);
    // Outside the ellipse the card's left edge (near x = 30) is softened: values between the plate and the card.
    double moved = 0;
    for (int y = 35; y < 75; ++y)
        for (int x = 15; x < 45; ++x)
            moved = std::max(moved, double(std::fabs(first->GetFlt(x, y).R - lift->GetFlt(x, y).R)));
    EXPECT_GT(moved, 0.05);
}

} // namespace
} // namespace Orvane::clitest::maskedgrade
