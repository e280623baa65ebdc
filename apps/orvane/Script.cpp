// orvane script: runs a Lua file in the trusted script environment, with the
// script classes (EXRIO) and the image API, `arg` holding the file name at
// index 0 and the arguments after it from 1 on. Raw scripts reach files and
// processes, so the command runs one only with the user's permission:
// --allow-scripts, or ORVANE_ALLOW_SCRIPTS=1 in the environment.
// Exit: 0 the script ran to its end, 2 bad command line or no permission,
// 3 the script failed (its message, FILE:LINE: ..., on stderr).
#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/script/ScriptClasses.h"
#include "host/script/ScriptPermission.h"
#include "host/script/ScriptState.h"

namespace Orvane::Cli {

int RunScript(const std::vector<std::string> &args) {
    bool allow = false;
    ScriptLimits limits;
    std::vector<std::string> scriptArgs; // the file, then its arguments
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &a = args[i];
        if (!scriptArgs.empty()) {
            scriptArgs.push_back(a); // everything after the file belongs to the script
        } else if (a == "--allow-scripts") {
            allow = true;
        } else if (a == "--instruction-limit") {
            const double n = i + 1 < args.size() ? ParseNumberList(args[++i], 1, "instruction limit")[0] : -1;
            if (!(n >= 0) || n > 1e18)
                throw CliError(ExitUsage, "script: --instruction-limit needs a count >= 0 (0: none)");
            limits.trustedInstructions = static_cast<uint64_t>(n);
        } else if (a.rfind("--", 0) == 0) {
            throw CliError(ExitUsage, "script: unknown option " + a);
        } else {
            scriptArgs.push_back(a);
        }
    }
    if (scriptArgs.empty()) throw CliError(ExitUsage, "script: expected a Lua FILE");
    const std::string &file = scriptArgs[0];
    if (!allow && !AllowScriptsPreference()) {
        std::fprintf(stderr,
                     "orvane script: %s was not run: scripts are not allowed (use --allow-scripts or set "
                     "ORVANE_ALLOW_SCRIPTS=1)\n",
                     file.c_str());
        NoteScriptRefused();
        return ExitUsage;
    }
    std::ifstream in(file, std::ios::binary);
    if (!in) throw CliError(ExitUsage, "script: cannot read " + file);
    std::ostringstream text;
    text << in.rdbuf();

    SetAllowScripts(true);
    LoadLibrary(); // registers the script classes of the tool library
    ScriptState state(limits);
    if (std::string error = InstallScriptClasses(state); !error.empty())
        throw CliError(ExitFailed, "script: the script classes could not be set up: " + error);
    state.SetAlert([](const std::string &line) { std::fprintf(stderr, "%s\n", line.c_str()); });
    state.SetStringList(ScriptEnv::Trusted, "arg", scriptArgs);
    const std::string error = state.Run(ScriptEnv::Trusted, text.str(), file);
    std::fflush(stdout);
    if (!error.empty()) {
        std::fprintf(stderr, "ERROR: %s\n", error.c_str());
        return ExitFailed;
    }
    return ExitOk;
}

} // namespace Orvane::Cli
