// orvane submit, status and resubmit without a cluster: the batch script and job folder submit writes (with a
// stand-in sbatch that only records its call), a task of the script run here as Slurm would run it, the chunk
// table, and status and resubmit reading the files and logs the tasks leave.
#include <gtest/gtest.h>

#include <array>
#include <cstdlib>
#include <vector>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

namespace fs = std::filesystem;

/// A flow of a 16 x 8 gradient over frames 1-`last` written to `saverFile`.
std::string FarmFlow(const std::string &saverFile, int last = 24) {
    return "Orvane.Document { Version = 1, RenderRange = { 1, " + std::to_string(last) +
           " }, Tools = {\n  Bg = Background { Inputs = { Type = \"Gradient\", Width = 16, Height = 8 } },\n"
           "  Out = Saver { Inputs = { Clip = \"" +
           saverFile + "\", CreateDir = 1, Input = Bg.Output } },\n} }\n";
}

/// PATH set to `dir` alone while in scope.
struct PathOnly {
    explicit PathOnly(const fs::path &dir) : old(std::getenv("PATH") ? std::getenv("PATH") : "") {
        fs::create_directories(dir);
        // The test runner itself needs `timeout`.
        std::error_code ec;
        fs::create_symlink("/usr/bin/timeout", dir / "timeout", ec);
        setenv("PATH", dir.c_str(), 1);
    }
    ~PathOnly() { setenv("PATH", old.c_str(), 1); }
    std::string old;
};

/// A stand-in sbatch in `dir` that records its arguments and answers job ID 4242.
void FakeSbatch(const fs::path &dir) {
    fs::create_directories(dir);
    std::ofstream(dir / "sbatch") << "#!/bin/sh\necho \"$@\" >> " + Quote((dir / "sbatch.calls").string()) +
                                         "\necho '4242;cluster'\n";
    fs::permissions(dir / "sbatch", fs::perms::owner_all);
}

/// Runs array task `task` of a batch script as Slurm would; its exit code.
int RunTask(const fs::path &script, int task) {
    const std::string cmd = "SLURM_ARRAY_TASK_ID=" + std::to_string(task) + " /bin/bash " + Quote(script.string());
    const int status = std::system(cmd.c_str());
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

/// The line of `text` after `prefix`.
std::string After(const std::string &text, const std::string &prefix) {
    const size_t at = text.find(prefix);
    if (at == std::string::npos) return {};
    return text.substr(at + prefix.size(), text.find('\n', at) - at - prefix.size());
}

TEST(CliFarm, ChunksCoverTheFramesAsRenderCutsThem) {
    TempDir dir;
    const auto flow = dir.File("a.flow", FarmFlow((dir.Path() / "out/f.####.png").string(), 24));
    // Pieces are contiguous, the first ones a frame longer when the count does not divide evenly.
    struct Case {
        std::string args, tasks;
        std::vector<std::string> frames;
    } cases[] = {
        {"--chunks 4", "0-3", {"1-6", "7-12", "13-18", "19-24"}},
        {"--frames 1-10 --chunks 3", "0-2", {"1-4", "5-7", "8-10"}},
        {"--frames 1-10 --chunk-size 4", "0-2", {"1-4", "5-7", "8-10"}},
        {"--frames 1-10 --chunk-size 5", "0-1", {"1-5", "6-10"}},
        {"--frames 1-10x2 --chunks 2", "0-1", {"1,3,5", "7,9"}},
        {"--frames 5,3,1 --chunks 8", "0-2", {"5", "3", "1"}},
        {"", "0-2", {"1-8", "9-16", "17-24"}},
    };
    for (const Case &c : cases) {
        const CliRun r = Orvane("submit " + Quote(flow.string()) + " --dry-run " + c.args);
        ASSERT_EQ(r.exitCode, 0) << c.args << r.err;
        EXPECT_EQ(After(r.out, "#SBATCH --array="), c.tasks) << c.args;
        for (size_t i = 0; i < c.frames.size(); ++i)
            EXPECT_TRUE(Has(r.out, "#   task " + std::to_string(i) + ": chunk " + std::to_string(i + 1) + ", frames " +
                                       c.frames[i] + "\n"))
                << c.args;
        EXPECT_FALSE(Contains(r.out, "#   task " + std::to_string(c.frames.size()) + ":")) << c.args;
        // The frames of a chunk are those `orvane render --chunk` renders.
        const CliRun chunk =
            Orvane("render " + Quote(flow.string()) + " --log-format json " +
                   (c.args.find("--frames") == 0 ? c.args.substr(0, c.args.find(" --chunk")) : std::string()) +
                   " --chunk 2/" + std::to_string(c.frames.size()));
        EXPECT_TRUE(Has(chunk.out, "\"frames\": \"" + c.frames[1] + "\"")) << c.args;
    }
    EXPECT_FALSE(fs::exists(dir.Path() / "out/orvane-jobs")) << "a dry run writes nothing";
}

TEST(CliFarm, TheDryRunScriptIsValidBashWithTheOptionsAndAbsolutePaths) {
    TempDir dir;
    dir.File("a.flow", FarmFlow("out/f.####.png", 24));
    // A relative flow name from another folder: everything in the script is still absolute.
    const std::string cmd = "cd " + Quote(dir.Path().string()) + " && " +
                            Quote(std::string(ORVANE_BINARY_DIR) + "/orvane") +
                            " submit a.flow --dry-run --chunk-size 5 --mem 2G --cpus 3 --partition gpu "
                            "--time 1:00:00 --after 99 > script.sh";
    ASSERT_EQ(std::system(cmd.c_str()), 0);
    const std::string script = ReadFile(dir.Path() / "script.sh");
    EXPECT_EQ(std::system(("bash -n " + Quote((dir.Path() / "script.sh").string())).c_str()), 0) << script;
    const std::string jobs = (dir.Path() / "out/orvane-jobs/a-").string();
    for (const std::string &line :
         std::vector<std::string>{"#SBATCH --array=0-4\n", "#SBATCH --mem=2048M\n", "#SBATCH --cpus-per-task=3\n",
                                  "#SBATCH --partition=gpu\n", "#SBATCH --time=1:00:00\n",
                                  "#SBATCH --dependency=afterok:99\n", "#SBATCH --output=" + jobs})
        EXPECT_TRUE(Has(script, line));
    EXPECT_TRUE(Has(script, "exec '" + std::string(ORVANE_BINARY_DIR) + "/orvane' render '" + jobs));
    EXPECT_TRUE(Has(script, "/a.flow' --frames '1-24' --chunk \"$chunk/5\" --skip-existing --log-format json "
                            "--saver 'Out' --memory-limit 1536M --threads 3 >'" +
                                jobs));
    EXPECT_FALSE(fs::exists(dir.Path() / "out")) << "a dry run writes nothing";

    // Bad requests write nothing either.
    const auto flow = dir.Path() / "a.flow";
    const std::array<std::array<std::string, 2>, 4> bad = {{
        {"--chunks 2 --chunk-size 3", "give --chunks or --chunk-size, not both"},
        {"--mem lots", "submit: --mem: bad size 'lots'"},
        {"--after abc", "--after needs a job ID"},
        {"--saver Nope", "the flow has no Saver 'Nope'"},
    }};
    for (const auto &[args, error] : bad) {
        const CliRun r = Orvane("submit " + Quote(flow.string()) + " --dry-run " + args);
        EXPECT_EQ(r.exitCode, 2) << args;
        EXPECT_TRUE(Has(r.err, error));
    }
}

TEST(CliFarm, WithoutSbatchNothingIsWrittenOrSubmitted) {
    TempDir dir;
    const auto flow = dir.File("a.flow", FarmFlow((dir.Path() / "out/f.####.png").string()));
    PathOnly path(dir.Path() / "bin");
    const CliRun r = Orvane("submit " + Quote(flow.string()));
    EXPECT_EQ(r.exitCode, 4);
    EXPECT_TRUE(Has(r.err, "sbatch is not on PATH"));
    EXPECT_EQ(r.out, "");
    EXPECT_FALSE(fs::exists(dir.Path() / "out"));
}

TEST(CliFarm, TheCopyOfALoadersClipListNamesItsFilesAbsolutely) {
    TempDir dir;
    // Two 4-frame clips one after the other, by names relative to the flow, the second with a proxy.
    for (const char *name : {"a", "b"})
        ASSERT_EQ(Orvane("render " + Quote(dir.File(std::string(name) + ".flow",
                                                    FarmFlow((dir.Path() / name / "f.####.png").string(), 4))
                                               .string()))
                      .exitCode,
                  0);
    const auto flow = dir.File(
        "list.flow", "Orvane.Document { Version = 1, RenderRange = { 1, 8 }, Tools = {\n"
                     "  In = Loader { Clips = { { Filename = \"a/f.0001.png\", GlobalStart = 1 },\n"
                     "    { Filename = \"b/f.0001.png\", ProxyFilename = \"b/f.0001.png\", GlobalStart = 5 } },\n"
                     "    Inputs = { } },\n"
                     "  Out = Saver { Inputs = { Clip = \"out/c.####.tga\", CreateDir = 1, Input = In.Output } },\n"
                     "} }\n");
    ASSERT_EQ(Orvane("render " + Quote(flow.string()) + " --frames 8").exitCode, 0);
    const std::string reference = ReadFile(dir.Path() / "out/c.0008.tga");
    fs::remove(dir.Path() / "out/c.0008.tga");

    const fs::path bin = dir.Path() / "bin";
    FakeSbatch(bin);
    CliRun submitted;
    {
        PathOnly path(bin);
        submitted = Orvane("submit " + Quote(flow.string()) + " --frames 8");
    }
    ASSERT_EQ(submitted.exitCode, 0) << submitted.err;
    const fs::path job = After(submitted.out, "job folder: ");
    const std::string copy = ReadFile(job / "list.flow");
    EXPECT_TRUE(Has(copy, "Filename = \"" + (dir.Path() / "a/f.0001.png").string() + "\""));
    EXPECT_TRUE(Has(copy, "ProxyFilename = \"" + (dir.Path() / "b/f.0001.png").string() + "\""));
    EXPECT_FALSE(Contains(copy, "\"b/f.0001.png\""));
    // The copy, in its own folder, renders what the original did.
    EXPECT_EQ(RunTask(job / "submit-1.sh", 0), 0);
    EXPECT_EQ(ReadFile(dir.Path() / "out/c.0008.tga"), reference);
}

TEST(CliFarm, TasksRenderWhatALocalRenderDoesAndStatusAndResubmitFollowThem) {
    TempDir dir;
    // The input: 24 gradient frames, frame 14 missing. The shot reads them and writes TGA files, both by names
    // relative to the flow.
    const auto source = dir.File("src.flow", FarmFlow((dir.Path() / "in/g.####.png").string()));
    ASSERT_EQ(Orvane("render " + Quote(source.string())).exitCode, 0);
    const fs::path missing = dir.Path() / "in/g.0014.png";
    fs::rename(missing, dir.Path() / "g.0014.png");
    const auto flow = dir.File("shot.flow", "Orvane.Document { Version = 1, RenderRange = { 1, 24 }, Tools = {\n"
                                            "  In = Loader { Inputs = { Clip = \"in/g.0001.png\", GlobalIn = 1 } },\n"
                                            "  Out = Saver { Inputs = { Clip = \"out/c.####.tga\", CreateDir = 1, "
                                            "Input = In.Output } },\n} }\n");
    const fs::path out = dir.Path() / "out";

    // What a local render writes for chunk 2: the reference bytes.
    ASSERT_EQ(Orvane("render " + Quote(flow.string()) + " --chunk 2/4").exitCode, 0);
    std::vector<std::string> reference;
    for (int f = 7; f <= 12; ++f) {
        const fs::path file = out / ("c.00" + std::string(f < 10 ? "0" : "") + std::to_string(f) + ".tga");
        reference.push_back(ReadFile(file));
        fs::remove(file);
    }

    const fs::path bin = dir.Path() / "bin";
    FakeSbatch(bin);
    CliRun submitted;
    {
        PathOnly path(bin);
        submitted = Orvane("submit " + Quote(flow.string()) + " --chunks 4");
    }
    ASSERT_EQ(submitted.exitCode, 0) << submitted.err;
    EXPECT_TRUE(Starts(submitted.out, "submitted job 4242: 4 chunks of 24 frames\njob folder: "));
    const fs::path job = After(submitted.out, "job folder: ");
    EXPECT_EQ(job.parent_path(), out / "orvane-jobs");
    EXPECT_EQ(ReadFile(bin / "sbatch.calls"), "--parsable " + (job / "submit-1.sh").string() + "\n");

    // The copy names every file absolutely.
    const std::string copy = ReadFile(job / "shot.flow");
    EXPECT_TRUE(Has(copy, "Clip = \"" + (dir.Path() / "in/g.0001.png").string() + "\""));
    EXPECT_TRUE(Has(copy, "Clip = \"" + (out / "c.####.tga").string() + "\""));

    // Task 1 (chunk 2) writes the reference bytes.
    EXPECT_EQ(RunTask(job / "submit-1.sh", 1), 0);
    for (int f = 7; f <= 12; ++f)
        EXPECT_EQ(ReadFile(out / ("c.00" + std::string(f < 10 ? "0" : "") + std::to_string(f) + ".tga")),
                  reference[f - 7])
            << "frame " << f;
    // Task 2 (chunk 3) meets the missing input frame.
    EXPECT_EQ(RunTask(job / "submit-1.sh", 2), 3);

    const CliRun status = Orvane("status " + Quote(job.string()));
    EXPECT_EQ(status.exitCode, 3) << status.err;
    EXPECT_EQ(status.out,
              "job 4242: " + job.string() +
                  "\nSlurm not reachable, from the logs only\n"
                  "chunk 1/4 frames 1-6: pending\n"
                  "chunk 2/4 frames 7-12: done\n"
                  "chunk 3/4 frames 13-18: failed (missing 14): frame 14 saver=Out: In failed to load file \"" +
                  missing.string() +
                  "\" (frame 14) : No such file or directory\n"
                  "chunk 4/4 frames 19-24: pending\n"
                  "11 of 24 frames written\n");

    // Only the chunks with missing frames go again; a dry run writes no script.
    const CliRun dry = Orvane("resubmit " + Quote(job.string()) + " --dry-run");
    EXPECT_EQ(dry.exitCode, 0) << dry.err;
    EXPECT_EQ(After(dry.out, "#SBATCH --array="), "0,2-3");
    EXPECT_FALSE(Contains(dry.out, "--dependency"));
    EXPECT_FALSE(fs::exists(job / "submit-2.sh"));

    // Slurm's view, where its commands answer: the queue holds task 0 running, accounting says task 3 ran out of
    // time. A running chunk is not submitted again.
    std::ofstream(bin / "squeue") << "#!/bin/sh\necho '4242_0|RUNNING'\n";
    std::ofstream(bin / "sacct") << "#!/bin/sh\necho '4242_1|COMPLETED'\necho '4242_3|TIMEOUT'\n";
    fs::permissions(bin / "squeue", fs::perms::owner_all);
    fs::permissions(bin / "sacct", fs::perms::owner_all);
    CliRun viewed, skipRunning;
    {
        PathOnly path(bin);
        viewed = Orvane("status " + Quote(job.string()));
        skipRunning = Orvane("resubmit " + Quote(job.string()) + " --dry-run");
    }
    EXPECT_FALSE(Contains(viewed.out, "Slurm not reachable"));
    EXPECT_TRUE(Has(viewed.out, "chunk 1/4 frames 1-6: running (missing 1-6)\n"));
    EXPECT_TRUE(
        Has(viewed.out, "chunk 4/4 frames 19-24: failed (missing 19-24): slurm: TIMEOUT; no error in the logs\n"));
    EXPECT_EQ(After(skipRunning.out, "#SBATCH --array="), "2-3");
    fs::remove(bin / "squeue");
    fs::remove(bin / "sacct");

    // With the input back, the resubmitted tasks complete the job; frames written stay as they are.
    fs::rename(dir.Path() / "g.0014.png", missing);
    CliRun again;
    {
        PathOnly path(bin);
        again = Orvane("resubmit " + Quote(job.string()));
    }
    ASSERT_EQ(again.exitCode, 0) << again.err;
    EXPECT_TRUE(Has(ReadFile(job / "submit-2.sh"), "#SBATCH --array=0,2-3\n"));
    for (int task : {0, 2, 3}) EXPECT_EQ(RunTask(job / "submit-2.sh", task), 0);
    EXPECT_TRUE(Has(ReadFile(job / "logs/chunk-3.json"), "\"skipped\": 5"));
    const CliRun done = Orvane("status " + Quote(job.string()));
    EXPECT_EQ(done.exitCode, 0) << done.out;
    EXPECT_TRUE(Has(done.out, "chunk 3/4 frames 13-18: done\n"));
    EXPECT_TRUE(Has(done.out, "24 of 24 frames written\n"));
    const CliRun nothing = Orvane("resubmit " + Quote(job.string()) + " --dry-run");
    EXPECT_TRUE(Starts(nothing.out, "no chunk to submit"));

    // A folder that is not a job.
    const CliRun notJob = Orvane("status " + Quote(dir.Path().string()));
    EXPECT_EQ(notJob.exitCode, 2);
    EXPECT_TRUE(Has(notJob.err, "is not a job folder"));
}

} // namespace
} // namespace Orvane::clitest
