#include "host/script/ScriptPermission.h"

#include <atomic>
#include <cstdlib>
#include <cstring>

namespace Orvane {
namespace {
std::atomic<bool> g_allowScripts{false};
std::atomic<long long> g_refusals{0};
} // namespace

void SetAllowScripts(bool allow) { g_allowScripts.store(allow, std::memory_order_relaxed); }
bool ScriptsAllowed() { return g_allowScripts.load(std::memory_order_relaxed); }

bool AllowScriptsPreference() {
    const char *value = std::getenv("ORVANE_ALLOW_SCRIPTS");
    return value && std::strcmp(value, "1") == 0;
}

void NoteScriptRefused() { g_refusals.fetch_add(1, std::memory_order_relaxed); }
long long ScriptRefusals() { return g_refusals.load(std::memory_order_relaxed); }

} // namespace Orvane
