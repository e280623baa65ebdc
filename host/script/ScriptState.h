#pragma once
// ScriptState: one LuaJIT state with two environments.
//
//   Sandbox   expression code: math, bit, string (without dump), table, the
//             plain value functions (type, tonumber, pairs, ...), the pixel
//             API (FltPixel, PixPtr, Image methods, _MPDispatch), _ALERT,
//             what the caller sets, and for pixel templates ffi.sizeof and
//             ffi.copy of FltPixel only, jit.flush and jit.opt.start. No os,
//             io, require, load, dofile, the rest of ffi and jit, debug, package, getfenv/setfenv, rawget/rawset,
//             getmetatable, collectgarbage, pcall.
//   Trusted   raw scripts the user allowed (ScriptPermission.h): the full
//             standard library, ffi and jit, the pixel API and _ALERT.
//
// Limits. Memory is bounded by the state's allocator (a hard byte limit for
// the whole state). Instructions are counted by a count hook every
// kHookPeriod instructions, against a budget per Run (per environment); once
// over, the hook fires on every instruction, so a script that catches the
// error cannot go on. The hook also polls an abort word. Compiled traces do
// not call hooks, so a limited state runs with the JIT compiler off; with
// ScriptLimits::jit the compiler runs and neither the instruction budget nor
// the abort word is checked inside the script.
//
// Errors are returned as text: "name:line: message" for syntax and run-time
// errors. Binary (bytecode) chunks are refused.
//
// Thread safety: a state belongs to one thread at a time. Different states
// run at once freely.
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "host/core/Export.h"

struct lua_State;

namespace Orvane {

class Image;

/// The message of a script stopped by its abort word.
inline constexpr const char *kScriptAbortedMessage = "stopped: the render was aborted";

enum class ScriptEnv { Sandbox, Trusted };

struct ScriptLimits {
    /// Instructions per Run in each environment; 0: unbounded.
    uint64_t sandboxInstructions = 100'000'000;
    uint64_t trustedInstructions = 10'000'000'000;
    /// Bytes the whole state may hold; 0: unbounded.
    size_t memoryBytes = size_t(256) << 20;
    /// Runs the JIT compiler (and gives up the instruction budget and abort polling).
    bool jit = false;
};

class ORVANE_API ScriptState {
public:
    /// Instructions between two calls of the count hook.
    static constexpr int kHookPeriod = 1000;
    using AlertFn = std::function<void(const std::string &)>;
    /// A host function of numbers: `args` holds the call's `count` arguments (at most
    /// kMaxFunctionArgs); the result goes back to the script. It must not throw: a C++
    /// exception that escapes becomes a script error.
    using NumberFunction = double (*)(void *data, const double *args, int count);
    static constexpr int kMaxFunctionArgs = 8;

    /// Throws std::bad_alloc when the state cannot be made.
    explicit ScriptState(const ScriptLimits &limits = {});
    ~ScriptState();
    ScriptState(const ScriptState &) = delete;
    ScriptState &operator=(const ScriptState &) = delete;

    /// Where _ALERT(text) goes (default: nowhere).
    void SetAlert(AlertFn fn);
    /// A word polled (atomically) by the count hook; non-zero stops the running script. Null: none.
    void SetAbortWord(const int32_t *abort);

    /// Compiles `text` under `chunkName` and runs it in `env`. Empty on success, else the message.
    std::string Run(ScriptEnv env, std::string_view text, std::string_view chunkName = "script");

    /// Globals of an environment.
    void SetNumber(ScriptEnv env, const char *name, double value);
    void SetString(ScriptEnv env, const char *name, std::string_view value);
    /// Sets `name` to a table of texts: values[0] at index 0, the others from 1 on (a script's `arg`).
    void SetStringList(ScriptEnv env, const char *name, const std::vector<std::string> &values);
    /// Sets `name` to a cdata pointer of C type `ctype` ("Image *", "int32_t *"); null sets nil. The
    /// script keeps the pointer: the caller sets it to null before the object goes away.
    void SetPointer(ScriptEnv env, const char *name, const char *ctype, void *ptr);
    void SetImage(ScriptEnv env, const char *name, Image *img) { SetPointer(env, name, "Image *", img); }
    /// Sets `name` to a Lua function that calls `fn` with `data` and its arguments, all
    /// numbers (a script error otherwise). The state keeps `data` as given: the caller keeps
    /// it valid while scripts may call the function (or sets the name again).
    void SetFunction(ScriptEnv env, const char *name, NumberFunction fn, void *data);
    /// The number `name` holds, or `fallback` when it holds none.
    double GetNumber(ScriptEnv env, const char *name, double fallback = 0) const;

    /// Bytes the state holds now.
    size_t MemoryUsed() const;
    const ScriptLimits &Limits() const;

    /// For host/script: the Lua state, and a protected call of the function below
    /// `nargs` arguments on its stack under `env`'s budget (results dropped).
    lua_State *Lua() const;
    std::string CallOnStack(ScriptEnv env, int nargs);
    /// Pushes `env`'s globals table.
    void PushEnv(ScriptEnv env) const;
    /// Pushes a Lua function of the host binding (see ScriptState.cpp).
    void PushBindingFunction(const char *name) const;

    struct Impl;

private:
    std::unique_ptr<Impl> impl_;
};

} // namespace Orvane
