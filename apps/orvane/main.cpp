// orvane: the command line over the Orvane host.
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"

namespace {

const char *const Usage = R"(usage: orvane COMMAND [ARGS]

commands:
  tools [--search WORD] [--all]  list the classes (class ID, name, kind, category, built);
                                 --all adds abstract bases and hidden classes
  describe CLASS                 show a class's pages and inputs
  eval FLOW TOOL[.OUTPUT] [--time T] [--roi x0,y0,x1,y1] [--pixel X,Y ...]
       [--set TOOL.INPUT=VALUE ...] [--threads N] [--device D] [--json]
                                 evaluate one output of a flow document and print what it holds
  render FLOW [--frames SPEC] [--chunk I/N] [--saver NAME ...] [--set TOOL.INPUT=VALUE ...]
         [--threads N] [--device D] [--memory-limit SIZE] [--proxy N] [--skip-existing]
         [--log-format text|json]
                                 render the flow's Savers frame by frame (default: the document's
                                 render range); SPEC like 1-100, 1-100x2, 1,5,10-20, 10-1, -23--5;
                                 SIZE like 512M or 8G; Ctrl-C stops after the current frame
                                 D: cpu, auto, opencl or cuda (default: the document's UseGPU
                                 preference, else cpu); a failed device run falls back to the CPU
  info FILE...                   what the formats read from files or sequences
                                 (format, size, depth, windows, frames and gaps)
  version                        print the program version

exit codes: 0 done, 2 bad command line or document, 3 a tool or frame failed, 130 interrupted
)";

} // namespace

int main(int argc, char **argv) {
    using namespace Orvane::Cli;
    std::vector<std::string> args(argv + 1, argv + argc);
    if (args.empty() || args[0] == "--help" || args[0] == "-h" || args[0] == "help") {
        std::fputs(Usage, args.empty() ? stderr : stdout);
        return args.empty() ? ExitUsage : ExitOk;
    }
    const std::string command = args[0];
    args.erase(args.begin());
    try {
        if (command == "tools") return RunTools(args);
        if (command == "describe") return RunDescribe(args);
        if (command == "eval") return RunEval(args);
        if (command == "info") return RunInfo(args);
        if (command == "render") return RunRender(args);
        if (command == "version") {
            std::printf("orvane %s\n", ORVANE_VERSION);
            return ExitOk;
        }
        throw CliError(ExitUsage, "unknown command '" + command + "' (try orvane --help)");
    } catch (const CliError &e) {
        std::fprintf(stderr, "ERROR: %s\n", e.what());
        return e.exitCode;
    } catch (const std::exception &e) {
        std::fprintf(stderr, "ERROR: %s\n", e.what());
        return ExitFailed;
    }
}
