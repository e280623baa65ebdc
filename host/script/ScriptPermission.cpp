#include "host/script/ScriptPermission.h"

#include <atomic>

namespace Orvane {
namespace {
std::atomic<bool> g_allowScripts{false};
}

void SetAllowScripts(bool allow) { g_allowScripts.store(allow, std::memory_order_relaxed); }
bool ScriptsAllowed() { return g_allowScripts.load(std::memory_order_relaxed); }

} // namespace Orvane
