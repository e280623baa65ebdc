// The shapes example (examples/lower-third.flow) rendered from the command line: pixels of the bar, the star cut
// out of it, its white rim and the first dot against the plate and colours worked out here, and the tree the
// graphic is made of.
#include <gtest/gtest.h>

#include <filesystem>

#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "host/shape/ShapeTree.h"
#include "tests/apps/CliRun.h"
#include "tests/support/TestSupport.h"

namespace Orvane::clitest::lowerthird {
namespace {

namespace fs = std::filesystem;

TEST(LowerThirdExample, RendersTheShapesOverThePlate) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    const fs::path flow = dir.Path() / "lower-third.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/lower-third.flow", flow);
    const CliRun r = Orvane("render " + Quote(flow.string()) + " --frames 1");
    ASSERT_EQ(r.exitCode, 0) << r.out << r.err;
    const Ref<Image> got = ReadFrame(dir.Path() / "out/shapes/lower-third.0001.exr");
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(ReadFile(flow), *doc).ok);
    const Ref<Image> plate = Orvane::Test::EvalImage(doc->FindTool("Plate"), 1.0);
    ASSERT_TRUE(got && plate);

    // In pixels of the 960 x 540 frame (shape units times 960): the bar spans x 57.6..633.6, y 49.2..145.2, the
    // star's tips reach 33.6 pixels from (115.2, 97.2), the rim is 3.84 pixels wide on the outlines, the first dot
    // has radius 9.6 about (652.8, 97.2).
    const FltPixel bar{0.05f, 0.2f, 0.45f, 1.f}, white{1.f, 1.f, 1.f, 1.f}, orange{1.f, 0.55f, 0.1f, 1.f};
    const struct {
        const char *what;
        int x, y;
        FltPixel colour;
        float opacity; ///< of the colour over the plate
    } cases[] = {{"bar", 345, 97, bar, 0.9f},          {"the star's hole", 115, 97, bar, 0.f},
                 {"rim, left edge", 57, 97, white, 1}, {"rim, top edge", 345, 145, white, 1},
                 {"first dot", 652, 97, orange, 1},    {"above the bar", 345, 300, bar, 0.f}};
    for (const auto &c : cases) {
        const FltPixel p = plate->GetFlt(c.x, c.y), g = got->GetFlt(c.x, c.y);
        EXPECT_NEAR(g.R, c.opacity * c.colour.R + (1 - c.opacity) * p.R, 1e-5) << c.what;
        EXPECT_NEAR(g.G, c.opacity * c.colour.G + (1 - c.opacity) * p.G, 1e-5) << c.what;
        EXPECT_NEAR(g.B, c.opacity * c.colour.B + (1 - c.opacity) * p.B, 1e-5) << c.what;
    }

    // The graphic: the cut bar, its rim, twenty dots.
    const Ref<Parameter> tree = Evaluate(doc->FindTool("Graphic")->FindMainOutput(), 1.0);
    const auto *shapes = dynamic_cast<const ShapeTree *>(tree.Get());
    ASSERT_TRUE(shapes);
    EXPECT_EQ(shapes->NodeCount(), 22);
    EXPECT_EQ(shapes->Styles().size(), 3u);
}

} // namespace
} // namespace Orvane::clitest::lowerthird
