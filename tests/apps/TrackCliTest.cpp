// orvane track from the command line: what it refuses before tracking anything, and that it leaves the flow as it
// was when it refuses. Runs over real trackers need the host's matcher in the tool library.
#include <gtest/gtest.h>

#include <string>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

constexpr const char *kTrackFlow = "Orvane.Document { Tools = { Background1 = Background { } } }\n";

TEST(TrackCli, RefusesWhatCannotBeTrackedAndLeavesTheFlowAlone) {
    TempDir dir;
    const auto path = dir.File("t.flow", kTrackFlow);
    const std::string flow = Quote(path.string());
    const struct {
        std::string args;
        int exit;
        std::string message;
    } cases[] = {
        {"track " + flow, 2, "see orvane track --help"},
        {"track " + flow + " Background1 --reverse --bidirectional", 2, "--reverse and --bidirectional"},
        {"track " + flow + " Backgroun1", 2, "the flow has no tool 'Backgroun1'"},
        {"track " + flow + " Background1 --frames 1-x", 2, "track: --frames:"},
        {"track " + flow + " Background1 --frames 1-5", 2, "Background1 (Background) has no trackers"},
        {"track " + flow + " Background1 --speed 2", 2, "unknown option --speed"},
    };
    for (const auto &c : cases) {
        const CliRun run = Orvane(c.args);
        EXPECT_EQ(run.exitCode, c.exit) << c.args << "\n" << run.err;
        EXPECT_NE(run.err.find(c.message), std::string::npos) << c.args << "\n" << run.err;
        EXPECT_EQ(ReadFile(path), kTrackFlow) << c.args;
    }
    const CliRun help = Orvane("--help");
    EXPECT_NE(help.out.find("orvane track FLOW TOOL [options]"), std::string::npos) << help.out;
}

} // namespace
} // namespace Orvane::clitest
