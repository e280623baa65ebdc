// What a write may replace, and clearing the temporaries of writers that are gone.
#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <fstream>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/wait.h>
#include <unistd.h>

#include "host/media/OutputFile.h"
#include "tests/support/TestSupport.h"

namespace Orvane::outputfiletest {
namespace {

namespace fs = std::filesystem;

using Orvane::Test::TempDir;

/// A process number that no process has now: a child that has exited and been reaped.
long DeadPid() {
    const pid_t child = fork();
    if (child == 0) _exit(0);
    waitpid(child, nullptr, 0);
    return child;
}

TEST(OutputFile, OnlyRegularFilesAreReplacedAndLinksToThemWrittenThrough) {
    TempDir dir;
    const fs::path d = dir.path;
    std::ofstream(d / "plain.png") << "x";
    fs::create_directory(d / "folder");
    ASSERT_EQ(mkfifo((d / "fifo").c_str(), 0600), 0);
    const bool device = mknod((d / "null").c_str(), S_IFCHR | 0600, makedev(1, 3)) == 0; // needs root
    fs::create_symlink(d / "plain.png", d / "to-plain.png");
    fs::create_symlink(d / "fifo", d / "to-fifo");
    fs::create_symlink(d / "none", d / "dangling");
    // The name, then the file written or why not.
    const std::pair<const char *, const char *> cases[] = {{"absent.png", "absent.png"},
                                                           {"plain.png", "plain.png"},
                                                           {"to-plain.png", "plain.png"},
                                                           {"folder", ": a folder, not a regular file"},
                                                           {"fifo", ": a FIFO, not a regular file"},
                                                           {"null", ": a character device, not a regular file"},
                                                           {"to-fifo", ": a symbolic link to a FIFO"},
                                                           {"dangling", ": a symbolic link to nothing"}};
    for (const auto &[name, want] : cases) {
        if (std::string(name) == "null" && !device) continue;
        const bool ok = want[0] != ':';
        std::string target, error;
        EXPECT_EQ(ResolveOutputFile((d / name).string(), target, error), ok) << name;
        EXPECT_EQ(ok ? target : error.substr(0, (d / name).string().size() + std::strlen(want)),
                  ok ? (d / want).string() : (d / name).string() + want);
    }
}

TEST(OutputFile, StaleTemporariesOfTheSameOutputAreRemoved) {
    TempDir dir;
    // This process's temporary for a file sits beside it and names the host and process.
    const fs::path temp = TemporaryFileFor(dir / "f.0001.exr");
    EXPECT_EQ(temp.parent_path(), fs::path(dir.path));
    TemporaryName mine;
    ASSERT_TRUE(ParseTemporaryName(temp.filename().string(), mine));
    EXPECT_EQ(std::pair(mine.target, long(mine.pid)), std::pair(std::string("f.0001.exr"), long(getpid())));
    const std::string dead = std::to_string(DeadPid()), alive = std::to_string(getpid());
    const auto old = fs::file_time_type::clock::now() - std::chrono::hours(2);
    // The name, whether it is long untouched, and whether it goes.
    const std::tuple<std::string, bool, bool> cases[] = {
        {".f.0001.exr.orvane-tmp-" + mine.host + "-" + dead, false, true},   // its writer is gone
        {".f.0002.exr.orvane-tmp-" + mine.host + "-" + alive, false, false}, // still writing
        {".f.0003.exr.orvane-tmp-farm-7-" + dead, false, false},             // another host, fresh
        {".f.0004.exr.orvane-tmp-farm-7-" + dead, true, true},               // another host, long untouched
        {".g.0001.exr.orvane-tmp-" + mine.host + "-" + dead, false, false},  // another output
        {".f.001.exr.orvane-tmp-" + mine.host + "-" + dead, false, false},   // not of the four-digit sequence
        {"f.0001.exr", true, false},
    };
    for (const auto &[name, oldFile, removed] : cases) {
        std::ofstream(dir / name) << "partial";
        if (oldFile) fs::last_write_time(dir / name, old);
    }
    EXPECT_EQ(RemoveStaleTemporaries(ParseSequenceName(dir / "f.####.exr")), 2);
    for (const auto &[name, oldFile, removed] : cases) EXPECT_EQ(fs::exists(dir / name), !removed) << name;

    // A name without a number: the one file's temporaries.
    std::ofstream(dir / (".still.png.orvane-tmp-" + mine.host + "-" + dead)) << "partial";
    EXPECT_EQ(RemoveStaleTemporaries(ParseSequenceName(dir / "still.png")), 1);
}

} // namespace
} // namespace Orvane::outputfiletest
