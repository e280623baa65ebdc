#pragma once
// Running the orvane command line as a separate process, the way scripts
// and render farms run it, for the command-line tests.
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>
#include <sys/wait.h>
#include <unistd.h>

#include "host/image/Image.h"
#include "host/media/Clip.h"
#include "tests/support/TestSupport.h"

namespace Orvane::clitest {

struct CliRun {
    int exitCode = -1;
    std::string out, err;
};

/// `s` quoted for the shell.
inline std::string Quote(const std::string &s) {
    std::string q = "'";
    for (char c : s) q += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return q + "'";
}

inline std::string ReadFile(const std::filesystem::path &p) {
    std::ifstream f(p, std::ios::binary);
    return {std::istreambuf_iterator<char>(f), {}};
}

/// A folder of its own, removed with everything in it.
struct TempDir : Orvane::Test::TempDir {
    std::filesystem::path Path() const { return path; }
    std::filesystem::path File(const std::string &name, const std::string &text) const {
        std::ofstream(Path() / name, std::ios::binary) << text;
        return Path() / name;
    }
};

/// Runs `orvane ARGS` (shell words) with no input, for 30 s at most (exit code 124: it was still running); its
/// exit code and output.
inline CliRun Orvane(const std::string &args) {
    TempDir dir;
    const auto outFile = dir.Path() / "out", errFile = dir.Path() / "err";
    const std::string cmd = "timeout 30 " + Quote(std::string(ORVANE_BINARY_DIR) + "/orvane") + " " + args + " >" +
                            Quote(outFile.string()) + " 2>" + Quote(errFile.string()) + " </dev/null";
    const int status = std::system(cmd.c_str());
    CliRun r;
    r.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    r.out = ReadFile(outFile);
    r.err = ReadFile(errFile);
    return r;
}

/// The first frame of an image file a render wrote (a failed expectation, and null, when it cannot be read).
inline Ref<Image> ReadFrame(const std::filesystem::path &file) {
    std::string error;
    Ref<Image> img = Clip(file.string()).GetFrameTagList(0, {}, error);
    EXPECT_TRUE(img) << file << ": " << error;
    return img;
}

inline bool Contains(const std::string &text, const std::string &part) { return text.find(part) != std::string::npos; }

/// Whether `text` starts with `prefix`, showing the whole text when not.
inline ::testing::AssertionResult Starts(const std::string &text, const std::string &prefix) {
    if (text.rfind(prefix, 0) == 0) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "no \"" << prefix << "\" first in:\n" << text;
}

/// Contains, showing the whole text when the part is missing.
inline ::testing::AssertionResult Has(const std::string &text, const std::string &part) {
    if (Contains(text, part)) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "no \"" << part << "\" in:\n" << text;
}

} // namespace Orvane::clitest
