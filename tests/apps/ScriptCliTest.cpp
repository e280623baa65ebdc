// Raw scripts from the command line: orvane script's permission rule, arguments, errors and limits, and the
// Saver's frame saved script under orvane render, allowed, refused, strict, failing, and after a failed write.
#include <gtest/gtest.h>

#include <cstdlib>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

namespace fs = std::filesystem;

/// Sets ORVANE_ALLOW_SCRIPTS for the processes started while it lives (null: unset).
struct AllowScriptsEnv {
    explicit AllowScriptsEnv(const char *value) {
        if (value)
            setenv("ORVANE_ALLOW_SCRIPTS", value, 1);
        else
            unsetenv("ORVANE_ALLOW_SCRIPTS");
    }
    ~AllowScriptsEnv() { unsetenv("ORVANE_ALLOW_SCRIPTS"); }
};

TEST(CliScript, RunsOnlyWithPermissionAndReportsErrorsAndStuckScripts) {
    TempDir dir;
    const fs::path args =
        dir.File("args.lua", "print(arg[0] ~= nil, arg[1], arg[2], EXRIO ~= nil, Image.New ~= nil)\n");
    const fs::path fails = dir.File("fails.lua", "local x = 1\nerror('gave up')\n");
    const fs::path stuck = dir.File("stuck.lua", "while true do end\n");
    struct Case {
        const char *env, *options;
        fs::path file;
        int exit;
        const char *out, *err;
    } cases[] = {
        {nullptr, "", args, 2, "",
         "was not run: scripts are not allowed (use --allow-scripts or set "
         "ORVANE_ALLOW_SCRIPTS=1)\n"},
        {"0", "", args, 2, "", "was not run"},
        {nullptr, "--allow-scripts ", args, 0, "true\ta\t--help\ttrue\ttrue\n", ""},
        {"1", "", args, 0, "true\ta\t--help\ttrue\ttrue\n", ""},
        {"1", "", fails, 3, "", "fails.lua:2: gave up"},
        {"1", "--instruction-limit 1000000 ", stuck, 3, "", "instruction limit of 1000000 reached"},
    };
    for (const Case &c : cases) {
        AllowScriptsEnv env(c.env);
        const CliRun r = Orvane("script " + std::string(c.options) + Quote(c.file.string()) + " a --help");
        const std::string what = std::string(c.options) + c.file.filename().string();
        EXPECT_EQ(r.exitCode, c.exit) << what << "\n" << r.err;
        EXPECT_EQ(r.out, c.out) << what;
        EXPECT_TRUE(Has(r.err, c.err)) << what;
        if (c.exit == 2) {
            EXPECT_EQ(std::count(r.err.begin(), r.err.end(), '\n'), 1) << r.err;
        }
    }
}

/// A flow whose Saver writes two PNG frames to `out` and runs `script` after each.
std::string ScriptFlow(const std::string &out, const std::string &script) {
    return "Orvane.Document { Version = 1, RenderRange = { 1, 2 }, Tools = {\n"
           "  Bg = Background { Inputs = { Type = \"Gradient\", Width = 16, Height = 8 } },\n"
           "  Out = Saver { Inputs = { Clip = \"" +
           out + "\", Input = Bg.Output, FrameSavedScript = \"" + script + "\" } },\n} }\n";
}

TEST(CliScript, FrameSavedScriptRunsAfterEachWriteOnlyWhenAllowed) {
    TempDir dir;
    fs::create_directories(dir.Path() / "out");
    const std::string log = (dir.Path() / "log.txt").string();
    const std::string logging = "local f = io.open('" + log +
                                "', 'a') f:write(frame, ' ', filename, ' ', time, ' ', tostring(req ~= nil), "
                                "'\\\\n') f:close()";
    const fs::path good = dir.File("good.orv", ScriptFlow((dir.Path() / "out/f.####.png").string(), logging));
    const fs::path noFolder = dir.File("nofolder.orv", ScriptFlow((dir.Path() / "none/f.####.png").string(), logging));
    const fs::path failing =
        dir.File("failing.orv", ScriptFlow((dir.Path() / "out/g.####.png").string(), "error('boom')"));
    const std::string f1 = (dir.Path() / "out/f.0001.png").string(), f2 = (dir.Path() / "out/f.0002.png").string();
    struct Case {
        fs::path flow;
        const char *options;
        int exit;
        std::string log;
        const char *err;
    } cases[] = {
        {good, "", 0, "", "WARNING: Out: frame saved script not run: scripts are not allowed (use --allow-scripts)"},
        {good, " --strict-scripts", 3, "", "--strict-scripts"},
        {good, " --allow-scripts", 0, "1 " + f1 + " 1 true\n2 " + f2 + " 2 true\n", ""},
        {noFolder, " --allow-scripts", 3, "", "failed to write"},
        {failing, " --allow-scripts", 0, "", "WARNING: Out: frame saved script failed: Out:1: boom"},
    };
    for (const Case &c : cases) {
        fs::remove(log);
        const CliRun r = Orvane("render " + Quote(c.flow.string()) + c.options);
        const std::string what = c.flow.filename().string() + c.options;
        EXPECT_EQ(r.exitCode, c.exit) << what << "\n" << r.err;
        EXPECT_EQ(ReadFile(log), c.log) << what;
        EXPECT_TRUE(Has(r.err, c.err)) << what;
        // The refusal is said once per render, not once per frame.
        const size_t first = r.err.find("script not run"), second = r.err.find("script not run", first + 1);
        EXPECT_TRUE(first == std::string::npos || second == std::string::npos) << r.err;
    }
}

} // namespace
} // namespace Orvane::clitest
