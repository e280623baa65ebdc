// The expressions example (examples/scripted-mix.flow) rendered from the command line: the Custom tool's mix
// against the two plates worked out here, and the composite of frames 1, 6 and 12 against the same document
// evaluated in process with the modifiers replaced by the values they should give (Spin: 7.5 degrees a frame;
// Grow: 0.5 plus a straight rise from 0 at frame 1 to 0.3 at frame 12).
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <filesystem>

#include <fmt/format.h>

#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "tests/apps/CliRun.h"
#include "tests/support/TestSupport.h"

namespace Orvane::clitest::scriptedmix {
namespace {

namespace fs = std::filesystem;

TEST(ScriptedMixExample, MixesByExpressionAndTurnsAndSizesByModifiers) {
    Orvane::Test::LoadOperators();
    TempDir dir;
    const fs::path flow = dir.Path() / "scripted-mix.flow";
    fs::copy_file(fs::path(ORVANE_SOURCE_DIR) / "examples/scripted-mix.flow", flow);
    const CliRun r = Orvane("render " + Quote(flow.string()) + " --frames 1-12");
    ASSERT_EQ(r.exitCode, 0) << r.out << r.err;

    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(ReadFile(flow), *doc).ok);
    const Ref<Image> warm = Orvane::Test::EvalImage(doc->FindTool("Warm"), 1.0),
                     cool = Orvane::Test::EvalImage(doc->FindTool("Cool"), 1.0),
                     mix = Orvane::Test::EvalImage(doc->FindTool("Mix"), 1.0);
    ASSERT_TRUE(warm && cool && mix);
    for (int y = 0; y < 180; y += 17)
        for (int x = 0; x < 320; x += 13) {
            const double t = x / 320.0, e = std::clamp(std::abs(t - 0.5) / 0.25, 0.0, 1.0);
            const double lift = 1 + 1.0 * (1 - e * e * (3 - 2 * e)) / 4; // s1 = 0.25 * 4
            const FltPixel a = warm->GetFlt(x, y), b = cool->GetFlt(x, y), m = mix->GetFlt(x, y);
            ASSERT_NEAR(m.R, (a.R + (b.R - a.R) * t) * lift, 1e-5) << x << "," << y;
            ASSERT_NEAR(m.B, (a.B + (b.B - a.B) * t) * lift, 1e-5) << x << "," << y;
            ASSERT_EQ(m.A, 1.f);
        }

    Operator *turn = doc->FindTool("Turn"), *comp = doc->FindTool("Comp");
    turn->FindInput("Angle")->Disconnect();
    comp->FindInput("Size")->Disconnect();
    for (int frame : {1, 6, 12}) {
        turn->FindInput("Angle")->SetValue(MakeRef<Number>(7.5 * frame));
        comp->FindInput("Size")->SetValue(MakeRef<Number>(0.5 + 0.3 * (frame - 1) / 11.0));
        const Ref<Image> want = Orvane::Test::EvalImage(comp, frame);
        const Ref<Image> got = ReadFrame(dir.Path() / fmt::format("out/scripted/mix.{:04d}.exr", frame));
        ASSERT_TRUE(want && got) << frame;
        double worst = 0;
        for (int y = 0; y < 180; ++y)
            for (int x = 0; x < 320; ++x) {
                const FltPixel a = got->GetFlt(x, y), b = want->GetFlt(x, y);
                worst = std::max(
                    {worst, double(std::fabs(a.R - b.R)), double(std::fabs(a.G - b.G)), double(std::fabs(a.B - b.B))});
            }
        EXPECT_LT(worst, 1e-5) << "frame " << frame;
    }
}

} // namespace
} // namespace Orvane::clitest::scriptedmix
