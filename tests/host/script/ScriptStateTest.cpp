// The script state: what sandboxed code cannot reach, the limits that stop stuck scripts in both
// environments, _ALERT, and error positions.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "host/script/ScriptPermission.h"
#include "host/script/ScriptState.h"

namespace Orvane::scriptstatetest {
namespace {

// Each snippet succeeds where its environment grants what it reaches for.
TEST(ScriptState, SandboxReachesNoneOfTheTrustedLibrary) {
    struct Case {
        const char *what, *code;
        bool trustedRuns;
    };
    const Case cases[] = {
        {"os.execute", "assert(os.execute)", true},
        {"io.open", "assert(io.open)", true},
        {"require", "assert(require('string'))", true},
        {"load", "assert(load(function() return nil end))", true},
        {"loadstring", "assert(loadstring('return 1'))", true},
        {"dofile", "assert(dofile)", true},
        {"ffi", "assert(ffi.new('int[1]'))", true},
        {"jit", "assert(jit.flush)", true},
        {"debug.getinfo", "assert(debug.getinfo(1))", true},
        {"string.dump", "assert(string.dump(function() end))", true},
        {"dump through a string's methods", "assert(('').dump(function() end))", false},
        {"getfenv(0)", "assert(getfenv(0).os)", true},
        {"setfenv", "setfenv(1, {})", true},
        {"rawget(_G, ...)", "assert(rawget(_G, 'os'))", true},
        {"package.loaded", "assert(package.loaded.os)", true},
        {"collectgarbage", "collectgarbage('count')", true},
        {"getmetatable('')", "assert(getmetatable('').__index)", true},
        {"a forged cursor", "local pp = PixPtr(nil); pp.opaque_[0] = 1", false},
        {"bytecode", "\x1bLJ\x02\x0a", false},
    };
    for (const Case &c : cases) {
        for (ScriptEnv env : {ScriptEnv::Sandbox, ScriptEnv::Trusted}) {
            ScriptState state;
            const std::string error = state.Run(env, c.code, "escape");
            const bool runs = env == ScriptEnv::Trusted && c.trustedRuns;
            EXPECT_EQ(error.empty(), runs) << c.what << (env == ScriptEnv::Trusted ? " (trusted): " : ": ") << error;
        }
    }
}

TEST(ScriptState, SandboxStillHasMathAndThePixelApi) {
    ScriptState state;
    // Null pointers reach the C side harmlessly: a cursor's method called without its cursor.
    EXPECT_EQ(state.Run(ScriptEnv::Sandbox, R"(
        local p = FltPixel(); p.R = math.sqrt(16) + bit.band(7, 3)
        local pp = PixPtr(nil); local go = pp.GotoXY; go(nil, 1, 2); pp:GetPixel(p)
        result = p.R + p.A + #string.rep('ab', 3))"),
              "");
    EXPECT_EQ(state.GetNumber(ScriptEnv::Sandbox, "result"), 6); // a null image's cursor reads a clear pixel
}

TEST(ScriptState, LimitsStopStuckScriptsInBothEnvironments) {
    struct Case {
        ScriptEnv env;
        uint64_t instructions;
        const char *code, *expected;
    };
    // Equal strings are one object in Lua, so this grows only the table: the instruction limit stops it.
    const char *sameStrings = "local t = {} while true do t[#t + 1] = string.rep('x', 1e6) end";
    const char *newStrings = "local t = {} while true do t[#t + 1] = string.rep('x', 1e6) .. #t end";
    const Case cases[] = {
        {ScriptEnv::Sandbox, 10'000'000, "while true do end", "instruction limit of 10000000 reached"},
        {ScriptEnv::Trusted, 20'000'000, "while true do end", "instruction limit of 20000000 reached"},
        // Catching the error does not help: the hook raises it again at once.
        {ScriptEnv::Trusted, 1'000'000, "while true do pcall(function() while true do end end) end",
         "instruction limit of 1000000 reached"},
        {ScriptEnv::Trusted, 1'000'000, "jit.on() while true do end", "JIT compiler stays off"},
        {ScriptEnv::Sandbox, 100'000, sameStrings, "instruction limit of 100000 reached"},
        {ScriptEnv::Trusted, 100'000, sameStrings, "instruction limit of 100000 reached"},
        {ScriptEnv::Sandbox, 10'000'000, newStrings, "memory limit of 32 MiB reached"},
        {ScriptEnv::Trusted, 10'000'000, newStrings, "memory limit of 32 MiB reached"},
        {ScriptEnv::Trusted, 10'000'000, "local s = string.rep('x', 1e8)", "memory limit of 32 MiB reached"},
    };
    for (const Case &c : cases) {
        ScriptLimits limits;
        limits.sandboxInstructions = limits.trustedInstructions = c.instructions;
        limits.memoryBytes = size_t(32) << 20;
        ScriptState state(limits);
        const std::string error = state.Run(c.env, c.code, "stuck");
        EXPECT_NE(error.find(c.expected), std::string::npos) << c.code << ": " << error;
        // The state lives on, its memory given back.
        EXPECT_EQ(state.Run(c.env, "x = 40 + 2"), "");
        EXPECT_EQ(state.GetNumber(c.env, "x"), 42);
        EXPECT_LT(state.MemoryUsed(), size_t(4) << 20) << c.code;
    }
}

TEST(ScriptState, AbortWordStopsARunningScript) {
    ScriptLimits limits;
    limits.sandboxInstructions = 0;
    ScriptState state(limits);
    int32_t abort = 1;
    state.SetAbortWord(&abort);
    EXPECT_NE(state.Run(ScriptEnv::Sandbox, "while true do end").find(kScriptAbortedMessage), std::string::npos);
}

TEST(ScriptState, AlertReachesTheCallback) {
    ScriptState state;
    std::vector<std::string> lines;
    state.SetAlert([&](const std::string &text) { lines.push_back(text); });
    EXPECT_EQ(state.Run(ScriptEnv::Sandbox, "_ALERT('sandbox ' .. 6 * 7)"), "");
    EXPECT_EQ(state.Run(ScriptEnv::Trusted, "_ALERT('trusted') _ALERT({})"), "");
    EXPECT_EQ(lines, (std::vector<std::string>{"sandbox 42", "trusted", "table"}));
}

TEST(ScriptState, ErrorsNameTheLine) {
    struct Case {
        const char *code, *expected;
    };
    const Case cases[] = {
        {"x = 1\ny = = 2", "calc:2:"},
        {"for i = 1, 2 do\nend end", "calc:2:"},
        {"local a\n\n\nlocal b = a.field", "calc:4:"},
        {"error('mine')", "calc:1: mine"},
    };
    ScriptState state;
    for (const Case &c : cases)
        for (ScriptEnv env : {ScriptEnv::Sandbox, ScriptEnv::Trusted}) {
            const std::string error = state.Run(env, c.code, "calc");
            EXPECT_EQ(error.rfind(c.expected, 0), 0u) << c.code << ": " << error;
        }
}

TEST(ScriptState, ScriptsAreRefusedUntilAllowed) {
    EXPECT_FALSE(ScriptsAllowed());
    SetAllowScripts(true);
    EXPECT_TRUE(ScriptsAllowed());
    SetAllowScripts(false);
}

} // namespace
} // namespace Orvane::scriptstatetest
