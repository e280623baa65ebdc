// The tracking examples from the command line, on a plate that drifts and turns (its motion worked out here):
// examples/track-stabilise.flow, where `orvane track` follows two points into paths saved in the document and
// `orvane render` writes the plate steadied by Match Move, every frame matching the first away from the edges the
// motion uncovers; and examples/track-pin.flow, where a card is pinned onto four tracked corners.
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

/// Where the Shake transform of the examples puts the point (px, py) of frame 1 at `frame`, in pixels: it turns
/// the 320 x 180 frame by up to 2 degrees about its centre and moves the centre by (10, 5) pixels over frames 1..12.
std::pair<double, double> Shaken(double px, double py, int frame) {
    const double t = (frame - 1) / 11.0, a = 2.0 * t * M_PI / 180;
    const double cx = (0.5 + 0.03125 * t) * 320, cy = (0.5 + 0.02778 * t) * 180;
    const double dx = (px - 0.5) * 320, dy = (py - 0.5) * 180;
    return {cx + dx * std::cos(a) - dy * std::sin(a), cy + dx * std::sin(a) + dy * std::cos(a)};
}

/// Copies an example into `dir`, tracks `tool` and renders it; false (with the failure) when either command fails.
::testing::AssertionResult TrackAndRender(const TempDir &dir, const char *example, const char *tool, fs::path &flow) {
    flow = dir.Path() / example;
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples" / example, flow);
    for (const std::string &command :
         {"track " + Quote(flow.string()) + " " + tool, "render " + Quote(flow.string())}) {
        const CliRun r = Orvane(command);
        if (r.exitCode != 0) return ::testing::AssertionFailure() << command << ":\n" << r.out << r.err;
    }
    return ::testing::AssertionSuccess();
}

TEST(TrackStabiliseExample, TracksThePlateAndSteadiesItOntoTheFirstFrame) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    fs::path flow;
    ASSERT_TRUE(TrackAndRender(dir, "track-stabilise.flow", "Stab", flow));

    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(ReadFile(flow), *doc).ok);
    const Input *path = doc->FindTool("Stab")->FindInput("TrackedCenter1");
    // The example's patterns have the default size, 16 x 9 pixels, over waves tens of pixels long: the matcher
    // holds them to a few hundredths of a pixel, under a tenth.
    for (int frame = 1; frame <= 12; ++frame) {
        const auto [wx, wy] = Shaken(0.3, 0.4, frame);
        double x = 0, y = 0;
        InputPointAt(nullptr, path, frame, x, y);
        EXPECT_NEAR(x * 320, wx, 0.08) << "frame " << frame;
        EXPECT_NEAR(y * 180, wy, 0.08) << "frame " << frame;
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

TEST(TrackPinExample, PinsTheCardOntoTheFourTrackedCorners) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    fs::path flow;
    ASSERT_TRUE(TrackAndRender(dir, "track-pin.flow", "Pin", flow));
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(ReadFile(flow), *doc).ok);
    const double corners[4][2] = {{0.35, 0.35}, {0.65, 0.35}, {0.65, 0.65}, {0.35, 0.65}};
    const FltPixel card{1, 0.5f, 0, 1};
    for (int frame : {1, 6, 12}) {
        const Ref<Image> pinned = ReadFrame(dir.Path() / fmt::format("out/track/pinned.{:04d}.exr", frame));
        const Ref<Image> plate = Orvane::Test::EvalImage(doc->FindTool("Shake"), frame);
        ASSERT_TRUE(pinned && plate) << frame;
        // The quad's centre, worked out from where the plate's motion puts the corners.
        double mx = 0, my = 0;
        for (const auto &c : corners) {
            const auto [x, y] = Shaken(c[0], c[1], frame);
            mx += x / 4, my += y / 4;
        }
        for (const auto &c : corners) {
            // Three pixels in from each corner towards the centre lies the card; three pixels out, the plate.
            const auto [x, y] = Shaken(c[0], c[1], frame);
            const double len = std::hypot(mx - x, my - y), ux = (mx - x) / len, uy = (my - y) / len;
            const int ix = static_cast<int>(x + 3 * ux), iy = static_cast<int>(y + 3 * uy);
            const int ox = static_cast<int>(x - 3 * ux), oy = static_cast<int>(y - 3 * uy);
            Orvane::Test::ExpectPixelNear(pinned->GetFlt(ix, iy), card, 1e-3, fmt::format("inside, frame {}", frame));
            Orvane::Test::ExpectPixelNear(pinned->GetFlt(ox, oy), plate->GetFlt(ox, oy), 1e-4,
                                          fmt::format("outside, frame {}", frame));
        }
    }
}

} // namespace
} // namespace Orvane::clitest::trackstabilise
