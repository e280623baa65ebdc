#include "host/script/ScriptPool.h"

#include <algorithm>
#include <mutex>
#include <new>

extern "C" {
#include <lua.h>
}

#include "host/core/Parallel.h"

namespace Orvane {

ScriptLimits PixelScriptLimits() {
    ScriptLimits limits;
    limits.sandboxInstructions = limits.trustedInstructions = 100'000'000'000;
    limits.memoryBytes = size_t(64) << 20;
    return limits;
}

ScriptPool::ScriptPool(const ScriptLimits &limits, ScriptEnv env) : limits_(limits), env_(env) {}
ScriptPool::~ScriptPool() = default;

void ScriptPool::SetAlert(ScriptState::AlertFn fn) {
    alert_ = std::move(fn);
    for (Slot &slot : slots_)
        if (slot.state) slot.state->SetAlert(alert_);
}

int ScriptPool::StateCount() const {
    return static_cast<int>(std::count_if(slots_.begin(), slots_.end(), [](const Slot &s) { return bool(s.state); }));
}

std::string ScriptPool::RunSlot(Slot &slot, int worker, std::string_view text, size_t hash, int lines, int32_t *counter,
                                int32_t *abort, const Setup &setup) {
    if (!slot.state) {
        try {
            slot.state = std::make_unique<ScriptState>(limits_);
        } catch (const std::bad_alloc &) {
            return "a script state could not be made (out of memory)";
        }
        slot.state->SetAlert(alert_);
    }
    ScriptState &state = *slot.state;
    state.SetAbortWord(abort);
    if (!slot.loaded || slot.textHash != hash || slot.textSize != text.size()) {
        slot.loaded = false;
        ++compilations_;
        if (std::string error = state.Run(env_, text, "pixel script"); !error.empty()) return error;
        slot.loaded = true;
        slot.textHash = hash;
        slot.textSize = text.size();
    }
    if (setup) setup(state, worker);
    lua_State *L = state.Lua();
    state.PushBindingFunction("dispatch");
    state.PushEnv(env_);
    lua_pushnumber(L, lines);
    lua_pushlightuserdata(L, counter);
    lua_pushlightuserdata(L, abort);
    std::string error = state.CallOnStack(env_, 4);
    state.SetAbortWord(nullptr);
    return error;
}

std::string ScriptPool::Dispatch(std::string_view text, int firstLine, int lines, int32_t *abort, const Setup &setup,
                                 int workers) {
    const int n = workers > 0 ? workers : WorkerCount();
    if (static_cast<int>(slots_.size()) < n) slots_.resize(n);
    int32_t ownAbort = 0;
    if (!abort) abort = &ownAbort;
    int32_t counter = firstLine;
    const size_t hash = std::hash<std::string_view>{}(text);
    std::mutex lock;
    std::vector<std::string> errors;
    ParallelFor(
        n,
        [&](int worker) {
            std::string error = RunSlot(slots_[worker], worker, text, hash, lines, &counter, abort, setup);
            if (error.empty()) return;
            std::atomic_ref<int32_t>(*abort).store(1, std::memory_order_relaxed);
            std::lock_guard<std::mutex> hold(lock);
            if (std::find(errors.begin(), errors.end(), error) == errors.end()) errors.push_back(std::move(error));
        },
        1);
    // Workers stopped mid-line by another worker's failure add nothing to its message.
    if (errors.size() > 1)
        std::erase_if(errors, [](const std::string &e) { return e.find(kScriptAbortedMessage) != std::string::npos; });
    std::string message;
    for (const std::string &e : errors) message += (message.empty() ? "" : "\n") + e;
    return message;
}

} // namespace Orvane
