#pragma once
// ScriptPool: one ScriptState per worker for pixel scripts, made when first
// needed and kept across renders. A script text is compiled once per state:
// each state remembers a hash of the text it ran last and runs a new text only
// when that changes.
//
// Dispatch runs the text's rows on the workers. Every worker's state calls the
// script's global _MPDispatch(chunkfunc, initfunc, lines, counter, abort):
// initfunc once, then chunkfunc(y) for each line y taken from the shared
// counter (atomic, one line at a time, so the work balances itself) until the
// counter reaches `lines` or the abort word is set. A worker that fails sets
// the abort word, so the others stop; the messages of all workers come back
// as one text, each distinct message once.
//
// The text runs in the sandbox by default. States run with the JIT compiler
// off (a stuck loop stops at the abort word or the instruction budget);
// PixelScriptLimits() gives the numbers.
//
// Thread safety: one Dispatch at a time per pool; Dispatch itself uses the
// workers (Parallel.h), and each state is used by one of them at a time.
#include <atomic>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "host/script/ScriptState.h"

namespace Orvane {

/// Limits of a pixel script's state: 1e11 instructions per dispatch and worker (minutes of
/// work, past any real frame), 64 MiB (a pixel script keeps a few pixels; images stay host memory).
ORVANE_API ScriptLimits PixelScriptLimits();

class ORVANE_API ScriptPool {
public:
    /// Called in each worker's state after the text is loaded and before _MPDispatch
    /// (globals such as images and time); `worker` numbers the state.
    using Setup = std::function<void(ScriptState &state, int worker)>;

    explicit ScriptPool(const ScriptLimits &limits = PixelScriptLimits(), ScriptEnv env = ScriptEnv::Sandbox);
    ~ScriptPool();

    /// Where _ALERT goes in every state.
    void SetAlert(ScriptState::AlertFn fn);

    /// Runs lines [firstLine, lines) of `text` on `workers` states (0: WorkerCount()). `abort`
    /// may be null. Empty on success, else the collected messages.
    std::string Dispatch(std::string_view text, int firstLine, int lines, int32_t *abort, const Setup &setup = {},
                         int workers = 0);

    /// States made so far, and how many times a state compiled a text.
    int StateCount() const;
    int Compilations() const { return compilations_.load(); }

private:
    struct Slot {
        std::unique_ptr<ScriptState> state;
        size_t textHash = 0, textSize = 0;
        bool loaded = false;
    };
    std::string RunSlot(Slot &slot, int worker, std::string_view text, size_t hash, int lines, int32_t *counter,
                        int32_t *abort, const Setup &setup);

    ScriptLimits limits_;
    ScriptEnv env_;
    ScriptState::AlertFn alert_;
    std::vector<Slot> slots_;
    std::atomic<int> compilations_{0};
};

} // namespace Orvane
