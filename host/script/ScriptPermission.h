#pragma once
// The host's rule for raw scripts: text that runs in the trusted script
// environment (full standard library, files, processes) runs only when the
// user allowed it for this process. The preference lives in the host, never in
// a document, so opening a document cannot grant it. `orvane render
// --allow-scripts` sets it; it is off by default.
//
// Expressions (the sandboxed environment) do not need it.
//
// Thread safety: both functions may be called from any thread.
#include "host/core/Export.h"

namespace Orvane {

/// Sets the host preference AllowScripts.
ORVANE_API void SetAllowScripts(bool allow);
/// True when raw scripts may run in this process.
ORVANE_API bool ScriptsAllowed();
/// The user's preference outside any document: ORVANE_ALLOW_SCRIPTS=1 in the environment.
ORVANE_API bool AllowScriptsPreference();
/// Counts a raw script not run because scripts are not allowed.
ORVANE_API void NoteScriptRefused();
/// The scripts refused since the process began.
ORVANE_API long long ScriptRefusals();

} // namespace Orvane
