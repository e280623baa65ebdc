// orvane submit, status and resubmit on a live one-node Slurm cluster (scripts/slurm-cluster.sh, started by ctest
// before these tests and stopped after them; SLURM_CONF names it): a job's files equal a local render's byte for
// byte, a failed chunk is reported and resubmitted, and a task cancelled mid-chunk leaves no partial file.
#include <gtest/gtest.h>

#include <chrono>
#include <thread>
#include <vector>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

namespace fs = std::filesystem;

/// Runs a shell command; its exit code and output (both streams).
CliRun Shell(const std::string &command) {
    TempDir dir;
    const int status = std::system((command + " >" + Quote((dir.Path() / "out").string()) + " 2>&1").c_str());
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, ReadFile(dir.Path() / "out"), {}};
}

class FarmCluster : public ::testing::Test {
protected:
    void SetUp() override {
        if (!std::getenv("SLURM_CONF")) GTEST_SKIP() << "no test cluster: run through ctest or scripts/test-farm.sh";
    }
};

/// The job ID `submit` or `resubmit` printed.
std::string JobId(const CliRun &r) {
    const size_t at = r.out.find("submitted job ");
    return at == std::string::npos ? std::string() : r.out.substr(at + 14, r.out.find(':', at) - at - 14);
}

/// The job folder `submit` printed.
fs::path JobFolder(const CliRun &r) {
    const size_t at = r.out.find("job folder: ");
    return at == std::string::npos ? fs::path() : fs::path(r.out.substr(at + 12, r.out.find('\n', at) - at - 12));
}

/// Whether Slurm's queue holds job `id`, running or waiting.
bool Queued(const std::string &id) { return !Shell("squeue -h -r -j " + id + " -o %i").out.empty(); }

/// Waits until job `id` has left the queue; false after three minutes.
bool WaitForJob(const std::string &id) {
    for (int i = 0; i < 1800; ++i) {
        if (!Queued(id)) return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    return false;
}

/// The files of `folder`, name -> bytes (sub-folders left out).
std::map<std::string, std::string> Files(const fs::path &folder) {
    std::map<std::string, std::string> files;
    for (const auto &entry : fs::directory_iterator(folder))
        if (entry.is_regular_file()) files[entry.path().filename().string()] = ReadFile(entry.path());
    return files;
}

/// A flow of `frames` frames of a `w` x `h` gradient turning a degree a frame, written by Saver Out to
/// `saverFile`; `blur` adds a Blur of that size (a slower render).
std::string TurningFlow(const std::string &saverFile, int frames, int w, int h, int blur = 0) {
    return "Orvane.Document { Version = 1, RenderRange = { 1, " + std::to_string(frames) +
           " }, Tools = {\n"
           "  Bg = Background { Inputs = { Type = \"Gradient\", Width = " +
           std::to_string(w) + ", Height = " + std::to_string(h) +
           " } },\n"
           "  Turn = Transform { Inputs = { Angle = Curve { { 1, 0 }, { " +
           std::to_string(frames) + ", " + std::to_string(frames - 1) + " } }, Input = Bg.Output } },\n" +
           (blur ? "  Soft = Blur { Inputs = { XBlurSize = " + std::to_string(blur) + ", Input = Turn.Output } },\n"
                 : std::string()) +
           "  Out = Saver { Inputs = { Clip = \"" + saverFile +
           "\", CreateDir = 1, Input = " + (blur ? "Soft" : "Turn") + ".Output } },\n} }\n";
}

TEST_F(FarmCluster, FourChunksWriteTheFilesOfALocalRender) {
    TempDir dir;
    const auto local = dir.File("local.flow", TurningFlow("local/t.####.tga", 24, 64, 36));
    ASSERT_EQ(Orvane("render " + Quote(local.string())).exitCode, 0);
    const auto shot = dir.File("shot.flow", TurningFlow("out/t.####.tga", 24, 64, 36));

    // The script Slurm would be given passes its own check.
    const CliRun dry = Orvane("submit " + Quote(shot.string()) + " --chunks 4 --dry-run");
    ASSERT_EQ(dry.exitCode, 0) << dry.err;
    const auto script = dir.File("dry.sh", dry.out);
    const CliRun tested = Shell("sbatch --test-only " + Quote(script.string()));
    EXPECT_EQ(tested.exitCode, 0) << tested.out;

    // A job Slurm refuses: exit 3 with its reason; the folder stays, with no submission recorded.
    const CliRun refused = Orvane("submit " + Quote(shot.string()) + " --chunks 4 --partition nosuch");
    EXPECT_EQ(refused.exitCode, 3);
    EXPECT_TRUE(Has(refused.err, "sbatch did not take the job (exit 1): sbatch: error: invalid partition"));
    const fs::path kept =
        refused.err.substr(refused.err.find("(the script is ") + 15,
                           refused.err.rfind("/submit-1.sh)") - refused.err.find("(the script is ") - 15);
    EXPECT_TRUE(Has(ReadFile(kept / "job.json"), "\"submissions\": []\n"));

    const CliRun submitted = Orvane("submit " + Quote(shot.string()) + " --chunks 4");
    ASSERT_EQ(submitted.exitCode, 0) << submitted.err;
    const std::string id = JobId(submitted);
    ASSERT_FALSE(id.empty()) << submitted.out;
    ASSERT_TRUE(WaitForJob(id)) << "job " << id << " still queued after three minutes";

    const CliRun status = Orvane("status " + Quote(JobFolder(submitted).string()));
    EXPECT_EQ(status.exitCode, 0) << status.out << status.err;
    EXPECT_EQ(status.out, "job " + id + ": " + JobFolder(submitted).string() +
                              "\nchunk 1/4 frames 1-6: done\nchunk 2/4 frames 7-12: done\n"
                              "chunk 3/4 frames 13-18: done\nchunk 4/4 frames 19-24: done\n24 of 24 frames written\n");
    const auto expected = Files(dir.Path() / "local"), written = Files(dir.Path() / "out");
    EXPECT_EQ(written.size(), 24u);
    EXPECT_TRUE(written == expected) << "the job's files differ from the local render's";
}

TEST_F(FarmCluster, AFailedChunkIsReportedAndResubmittedAlone) {
    TempDir dir;
    // 24 input frames, frame 14 held back.
    const auto source = dir.File("src.flow", TurningFlow((dir.Path() / "in/g.####.png").string(), 24, 32, 18));
    ASSERT_EQ(Orvane("render " + Quote(source.string())).exitCode, 0);
    const fs::path missing = dir.Path() / "in/g.0014.png", aside = dir.Path() / "g.0014.png";
    fs::rename(missing, aside);
    const auto shot = dir.File("shot.flow", "Orvane.Document { Version = 1, RenderRange = { 1, 24 }, Tools = {\n"
                                            "  In = Loader { Inputs = { Clip = \"in/g.0001.png\", GlobalIn = 1 } },\n"
                                            "  Out = Saver { Inputs = { Clip = \"out/c.####.tga\", CreateDir = 1, "
                                            "Input = In.Output } },\n} }\n");

    const CliRun submitted = Orvane("submit " + Quote(shot.string()) + " --chunks 4");
    ASSERT_EQ(submitted.exitCode, 0) << submitted.err;
    const fs::path job = JobFolder(submitted);
    ASSERT_TRUE(WaitForJob(JobId(submitted)));

    const CliRun failed = Orvane("status " + Quote(job.string()));
    EXPECT_EQ(failed.exitCode, 3);
    EXPECT_TRUE(Has(failed.out, "chunk 2/4 frames 7-12: done\n"));
    EXPECT_TRUE(Has(failed.out, "chunk 3/4 frames 13-18: failed (missing 14): slurm: FAILED; frame 14 saver=Out: In "
                                "failed to load file \"" +
                                    missing.string() + "\" (frame 14) : No such file or directory\n"));
    EXPECT_TRUE(Has(failed.out, "23 of 24 frames written\n"));

    // With the frame back, only chunk 3 goes again, and the job is whole.
    fs::rename(aside, missing);
    const CliRun again = Orvane("resubmit " + Quote(job.string()));
    ASSERT_EQ(again.exitCode, 0) << again.err;
    EXPECT_TRUE(Has(ReadFile(job / "submit-2.sh"), "#SBATCH --array=2\n"));
    ASSERT_TRUE(WaitForJob(JobId(again)));
    const CliRun done = Orvane("status " + Quote(job.string()));
    EXPECT_EQ(done.exitCode, 0) << done.out;
    EXPECT_TRUE(Has(done.out, "chunk 3/4 frames 13-18: done\n"));
    EXPECT_TRUE(Has(done.out, "24 of 24 frames written\n"));
    EXPECT_TRUE(Has(ReadFile(job / "logs/chunk-3.json"), "\"skipped\": 5"));
}

TEST_F(FarmCluster, ACancelledTaskLeavesNoPartialFileAndResubmitFinishesIt) {
    TempDir dir;
    // Frames slow enough (a wide blur at 1920 x 1080, one thread) to cancel the task between its first and last.
    const int frames = 12;
    const auto local = dir.File("local.flow", TurningFlow("local/s.####.png", frames, 1920, 1080, 300));
    ASSERT_EQ(Orvane("render " + Quote(local.string()) + " --threads 1").exitCode, 0);
    const auto shot = dir.File("shot.flow", TurningFlow("out/s.####.png", frames, 1920, 1080, 300));

    const CliRun submitted = Orvane("submit " + Quote(shot.string()) + " --chunks 1 --cpus 1");
    ASSERT_EQ(submitted.exitCode, 0) << submitted.err;
    const std::string id = JobId(submitted);
    const fs::path job = JobFolder(submitted), out = dir.Path() / "out";
    auto written = [&] {
        size_t n = 0;
        for (const auto &entry : fs::directory_iterator(out)) n += entry.path().extension() == ".png";
        return n;
    };
    for (int i = 0; i < 1800 && (!fs::exists(out) || written() < 2); ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    ASSERT_GE(written(), 2u) << "the task wrote nothing in three minutes";
    EXPECT_EQ(Shell("scancel " + id).exitCode, 0);
    ASSERT_TRUE(WaitForJob(id));

    // Every file under a final name is whole, and nothing else is left in the folder.
    const auto expected = Files(dir.Path() / "local");
    size_t kept = 0;
    for (const auto &entry : fs::directory_iterator(out)) {
        const std::string name = entry.path().filename().string();
        if (name == "orvane-jobs") continue;
        ASSERT_TRUE(expected.count(name)) << "left behind: " << name;
        EXPECT_EQ(ReadFile(entry.path()), expected.at(name)) << name << " is not whole";
        ++kept;
    }
    EXPECT_LT(kept, static_cast<size_t>(frames)) << "the task ended before it was cancelled";

    const CliRun cancelled = Orvane("status " + Quote(job.string()));
    EXPECT_EQ(cancelled.exitCode, 3);
    EXPECT_TRUE(Has(cancelled.out, "chunk 1/1 frames 1-12: failed (missing " + std::to_string(kept + 1) +
                                       "-12): slurm: CANCELLED; the render was stopped by a signal\n"));

    // Resubmitted, the task goes on from the first missing frame; killed outright (as when its node fails) it
    // may leave a temporary file, never a partial one under a final name.
    const CliRun again = Orvane("resubmit " + Quote(job.string()));
    ASSERT_EQ(again.exitCode, 0) << again.err;
    for (int i = 0; i < 1800 && written() < kept + 1; ++i) std::this_thread::sleep_for(std::chrono::milliseconds(100));
    EXPECT_EQ(Shell("scancel --signal=KILL --full " + JobId(again)).exitCode, 0);
    ASSERT_TRUE(WaitForJob(JobId(again)));
    for (const auto &[name, bytes] : Files(out)) {
        if (name[0] == '.') continue; // a temporary file of the killed process
        ASSERT_TRUE(expected.count(name)) << "left behind: " << name;
        EXPECT_EQ(bytes, expected.at(name)) << name << " is not whole";
    }

    // The third run writes the rest and clears what the killed one left.
    const CliRun last = Orvane("resubmit " + Quote(job.string()));
    ASSERT_EQ(last.exitCode, 0) << last.err;
    ASSERT_TRUE(WaitForJob(JobId(last)));
    const CliRun done = Orvane("status " + Quote(job.string()));
    EXPECT_EQ(done.exitCode, 0) << done.out;
    EXPECT_TRUE(Files(out) == expected) << "the resumed job's files differ from the local render's";
}

} // namespace
} // namespace Orvane::clitest
