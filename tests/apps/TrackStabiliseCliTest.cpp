// The tracking example (examples/track-stabilise.flow) from the command line: `orvane track` follows two points of
// a plate that drifts and turns, saves their paths into the document, and `orvane render` writes the plate steadied
// by Match Move. Every steadied frame matches the first frame of the shot away from the edges the motion uncovers,
// and the paths follow the motion the Transform applied, worked out here.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <filesystem>

#include <fmt/format.h>

#include "host/flow/DocumentIO.h"
#include "host/flow/InputAt.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "tests/apps/CliRun.h"
#include "tests/support/TestSupport.h"

namespace Orvane::clitest::trackstabilise {
namespace {

namespace fs = std::filesystem;

TEST(TrackStabiliseExample, TracksThePlateAndSteadiesItOntoTheFirstFrame) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    const fs::path flow = dir.Path() / "track-stabilise.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/track-stabilise.flow", flow);
    const CliRun track = Orvane("track " + Quote(flow.string()) + " Stab");
    ASSERT_EQ(track.exitCode, 0) << track.out << track.err;
    const CliRun render = Orvane("render " + Quote(flow.string()));
    ASSERT_EQ(render.exitCode, 0) << render.out << render.err;

    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(ReadFile(flow), *doc).ok);
    // The Shake transform turns the frame by a degrees about its centre and moves it to (cx, cy): the pattern
    // centre (px, py) of frame 1 lands at (cx, cy) + R(a) ((px, py) - (0.5, 0.5)), in pixels.
    const Input *path = doc->FindTool("Stab")->FindInput("TrackedCenter1");
    for (int frame = 1; frame <= 12; ++frame) {
        const double t = (frame - 1) / 11.0, a = 2.0 * t * M_PI / 180;
        const double cx = (0.5 + 0.03125 * t) * 320, cy = (0.5 + 0.02778 * t) * 180;
        const double dx = (0.3 - 0.5) * 320, dy = (0.4 - 0.5) * 180;
        const double wx = cx + dx * std::cos(a) - dy * std::sin(a), wy = cy + dx * std::sin(a) + dy * std::cos(a);
        double x = 0, y = 0;
        InputPointAt(nullptr, path, frame, x, y);
        EXPECT_NEAR(x * 320, wx, 0.05) << "frame " << frame;
        EXPECT_NEAR(y * 180, wy, 0.05) << "frame " << frame;
    }

    const Ref<Image> first = Orvane::Test::EvalImage(doc->FindTool("Shake"), 1.0);
    ASSERT_TRUE(first);
    for (int frame : {4, 8, 12}) {
        const Ref<Image> steady = ReadFrame(dir.Path() / fmt::format("out/track/steady.{:04d}.exr", frame));
        ASSERT_TRUE(steady) << frame;
        double sum = 0, worst = 0;
        int n = 0;
        for (int y = 24; y < 156; ++y)
            for (int x = 32; x < 288; ++x) {
                const double d = std::fabs(steady->GetFlt(x, y).R - first->GetFlt(x, y).R);
                sum += d, worst = std::max(worst, d), ++n;
            }
        // Two resamplings (the shake and the steadying) of a smooth plate, and tracks good to a few hundredths of
        // a pixel: the steadied frame stands within a few thousandths of the first.
        EXPECT_LT(sum / n, 0.002) << "frame " << frame;
        EXPECT_LT(worst, 0.01) << "frame " << frame;
    }
}

} // namespace
} // namespace Orvane::clitest::trackstabilise
