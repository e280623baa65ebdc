// orvane: the command line over the Orvane host.
#include <algorithm>
#include <cstdio>
#include <cstring>
#include <pthread.h>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/core/Suggest.h"

namespace Orvane::Cli {
namespace {

struct Command {
    const char *name;
    int (*run)(const std::vector<std::string> &);
    const char *usage; ///< first line: the synopsis; then what it does and its options
};

int RunVersion(const std::vector<std::string> &) {
    std::printf("orvane %s\n", ORVANE_VERSION);
    return ExitOk;
}

const Command kCommands[] = {
    {"render", RunRender, R"(orvane render FLOW [options]
  Renders the flow's Savers frame by frame and writes their files.
  --frames SPEC         frames to render: 1-100, 1-100x2, 1,5,10-20, 10-1, -23--5
                        (default: the document's render range)
  --chunk I/N           the I-th of N equal pieces of the frame list (job arrays)
  --saver NAME          render only this Saver (repeatable)
  --set TOOL.INPUT=VALUE  change a value for this render (repeatable)
  --threads N           worker threads
  --device D            cpu, auto, opencl or cuda (default: the document's UseGPU
                        preference, else cpu); a failed device run falls back to the CPU
  --memory-limit SIZE   bound the process's image memory: 512M, 8G
  --proxy N             render at 1/N size
  --skip-existing       leave frames whose file exists
  --lenient             render a document with problems, taking them as warnings
  --allow-scripts       let the document's raw scripts run (with the full Lua library);
                        ORVANE_ALLOW_SCRIPTS=1 in the environment does the same
  --strict-scripts      a raw script not run for want of permission fails the render
  --log-format text|json  one line per event; json: one object per event
  Ctrl-C stops after the frame in hand; a second Ctrl-C stops at once.
  Exit: 0 all written, 2 bad command line or document, 3 a frame failed (or, with
  --strict-scripts, a script was not run), 130 interrupted.
)"},
    {"submit", RunSubmit, R"(orvane submit FLOW [options]
  Submits the flow's render to a Slurm cluster as one job array (docs/FARM.md):
  checks the flow, copies it with absolute file names into a job folder beside
  the first Saver's files (orvane-jobs/FLOW-TIME/: the copy, job.json, the batch
  script, the tasks' logs) and runs sbatch. Prints the job ID and the folder.
  --frames SPEC         frames to render, as for render (default: the render range)
  --chunks N            N array tasks, each a contiguous piece of the frames
  --chunk-size N        N frames a task (default 10)
  --saver NAME          render only this Saver (repeatable)
  --partition P, --time LIMIT   the Slurm partition and time limit
  --mem SIZE            memory a task asks for (512M, 8G); its render bounds its
                        image memory to three quarters of it
  --cpus N              CPUs a task asks for; its render runs N threads
  --after JOBID         start once that job has ended well
  --dry-run             print the batch script; write and submit nothing
  Exit: 0 submitted, 2 bad command line or document, 3 sbatch refused the job,
  4 sbatch is not on PATH (nothing written or submitted).
)"},
    {"status", RunStatus, R"(orvane status JOBFOLDER
  Says, per chunk of a submitted job, done (every frame's files exist),
  running, failed (its missing frames and first error) or pending, from the
  files, the tasks' logs and Slurm's view when squeue or sacct is on PATH.
  Exit: 0 every frame written, 2 not a job folder, 3 frames missing.
)"},
    {"resubmit", RunResubmit, R"(orvane resubmit JOBFOLDER [--dry-run]
  Submits again the chunks of a job with missing frames that Slurm does not
  hold queued or running; frames written stay (--skip-existing).
  --dry-run             print the batch script; write and submit nothing
  Exit: as for submit; 0 also when nothing is left to submit.
)"},
    {"eval", RunEval, R"(orvane eval FLOW TOOL[.OUTPUT] [options]
  Evaluates one output of a flow and prints its size, windows, depth, channel
  statistics, the pixels asked for and the console lines. Savers write nothing.
  --time T              the time to evaluate (default: the render range's start)
  --roi x0,y0,x1,y1     the region to evaluate
  --pixel X,Y ...       print these pixels
  --set TOOL.INPUT=VALUE  change a value (repeatable)
  --threads N, --device D, --lenient as for render
  --json                one JSON object
  Exit: 0 done, 2 bad command line or document, 3 a tool failed.
)"},
    {"check", RunCheck, R"(orvane check FLOW... [--lenient]
  Checks flow documents and lists every problem with its line and column.
  Exit: 0 no errors, 2 errors found.
)"},
    {"new", RunNew, R"(orvane new FLOW [--force]
  Writes an empty flow document (--force replaces an existing file).
)"},
    {"add", RunAdd, R"(orvane add FLOW CLASS NAME [INPUT=VALUE ...]
  Adds a tool of CLASS (an ID, alias or name as orvane tools lists it) named
  NAME, with the values given, and saves the flow.
)"},
    {"set", RunSetCommand, R"(orvane set FLOW TOOL.INPUT=VALUE ...
  Sets inputs and saves the flow. VALUE is a number, a choice name, "text",
  { x, y }, Curve { { time, value }, ... }, Tool.Output (a link), or for text,
  file and ID inputs any text as it stands.
)"},
    {"connect", RunConnect, R"(orvane connect FLOW TOOL.INPUT=OTHER[.OUTPUT] ...
  Links an input to another tool's output (its main output when none is named)
  and saves the flow.
)"},
    {"remove", RunRemove, R"(orvane remove FLOW TOOL...
  Removes tools (their links go with them) and saves the flow.
)"},
    {"pick", RunPick, R"(orvane pick FLOW TOOL[.COLOR] X0,Y0,X1,Y1 [options]
  Picks colours from a rectangle of an image, as dragging over it in a viewer
  does, and saves them into the flow. TOOL alone: the tool (a keyer) picks its
  colour ranges from its image. TOOL.COLOR: the colour control COLOR (inputs
  COLORRed, COLORGreen, COLORBlue, e.g. Background) takes the mean colour of
  the image on the tool's main input. X0,Y0 and X1,Y1 are the corner pixels,
  both included, columns from the left and rows from the bottom.
  --subtract            take the picked colours out of the ranges
  --fractions           the corners are frame fractions (0..1) instead
  --time T              the frame to pick from (default: the render range's start)
  --device D, --lenient as for render
  Exit: 0 picked and saved, 2 bad command line or document, 3 nothing picked.
)"},
    {"track", RunTrack, R"(orvane track FLOW TOOL [options]
  Runs the trackers of a Tracker tool frame by frame, as its track buttons do,
  and saves the flow with their paths (TrackedCenter<n> keys). Each enabled
  tracker takes its pattern at the first frame of the run and follows it.
  --frames SPEC         the frames to track over, as for render (default: the
                        render range); the run covers its first to its last
  --reverse             track backwards, from the last frame to the first
  --bidirectional       track forwards to the last frame, then from the
                        same start back to the first
  --from T              the frame the run starts at (default: the first, or
                        the last with --reverse)
  --device D, --lenient as for render
  Exit: 0 tracked and saved, 2 bad command line or document, 3 nothing
  tracked (no tracker enabled, or no pattern found), 130 interrupted (what
  was tracked is saved).
)"},
    {"stroke", RunStroke, R"(orvane stroke FLOW TOOL add|sub|clear [X,Y ...] [--lenient]
  Adds a stroke to a Magic Mask's strokes, as drawing on the picture does, and
  saves the flow: add marks the object, sub marks what is not the object,
  clear removes every stroke. X,Y are frame fractions (0..1), x to the right
  and y up from the bottom-left corner; a stroke runs through its points in
  order. The tool tracks them with orvane track (docs/MAGIC_MASK.md).
  Exit: 0 saved, 2 bad command line or document.
)"},
    {"script", RunScript, R"(orvane script [options] FILE.lua [ARGS...]
  Runs a Lua script with the full Lua library, the script classes (EXRIO: OpenEXR
  files with several parts) and images (Image.New); arg[0] is FILE, arg[1]...
  the ARGS. Raw scripts reach files and processes: they run only with
  permission, --allow-scripts or ORVANE_ALLOW_SCRIPTS=1 in the environment.
  --allow-scripts       run the script
  --instruction-limit N stop the script after N Lua instructions (default 1e10; 0: none)
  Exit: 0 the script ran, 2 bad command line or not allowed, 3 the script failed.
)"},
    {"tools", RunTools, R"(orvane tools [--search WORD] [--all]
  Lists the classes: ID, name, kind, attributes, category, whether built.
  --all adds abstract bases and hidden classes.
)"},
    {"describe", RunDescribe, R"(orvane describe CLASS [--markdown]
  Shows a class's pages, inputs (type, control, default, limits, choices) and
  outputs. --markdown prints its reference page.
)"},
    {"info", RunInfo, R"(orvane info [--sequence] [--json] FILE...
  What a file holds: format, size, the image reading makes, the file's channels
  and sample types; OpenEXR: every part, view, window, channel and header
  attribute. A name is that file, never a sequence it might belong to.
  --sequence            the numbered sequence the name belongs to (frames, gaps);
                        a name with #### or %04d is a sequence by itself
  --json                one JSON array of files (docs/EXR.md)
  Exit: 0 every file read, 2 bad command line, 3 a file could not be read.
)"},
    {"colorspaces", RunColorSpaces, R"(orvane colorspaces [--config FILE]
  Lists the colour spaces (name, family, aliases) and roles of a colour
  configuration: FILE, else the one named by $OCIO, else the built-in one.
  Exit: 0 listed, 2 bad command line, 3 the configuration could not be read.
)"},
    {"version", RunVersion, R"(orvane version
  Prints the program version (also orvane --version).
)"},
};

std::string Synopsis(const Command &c) {
    const char *eol = std::strchr(c.usage, '\n');
    return std::string(c.usage, eol ? static_cast<size_t>(eol - c.usage) : std::strlen(c.usage));
}

void PrintUsage(std::FILE *to) {
    std::fputs("usage: orvane COMMAND [ARGS]   (orvane COMMAND --help for details)\n\ncommands:\n", to);
    for (const Command &c : kCommands) std::fprintf(to, "  %s\n", Synopsis(c).c_str());
    std::fputs("\nexit codes: 0 done, 2 bad command line or document, 3 a tool or frame failed, 4 Slurm not reachable "
               "(submit), 130 interrupted\n",
               to);
}

bool AsksForHelp(const std::vector<std::string> &args) {
    return std::any_of(args.begin(), args.end(), [](const std::string &a) { return a == "--help" || a == "-h"; });
}

int RunCaught(const Command &c, const std::vector<std::string> &args) {
    try {
        return c.run(args);
    } catch (const CliError &e) {
        std::fprintf(stderr, "ERROR: %s\n", e.what());
        return e.exitCode;
    } catch (const std::exception &e) {
        std::fprintf(stderr, "ERROR: %s\n", e.what());
        return ExitFailed;
    }
}

/// Runs a command on a thread with a deep stack: the engine walks a flow by recursion, about a kilobyte per tool
/// of depth, and a flow may be a chain of many thousands of tools. The stack is reserved address space; only what
/// a walk touches takes memory.
int RunOnDeepStack(const Command &c, const std::vector<std::string> &args) {
    constexpr size_t kStackBytes = size_t(256) << 20;
    struct Job {
        const Command &command;
        const std::vector<std::string> &args;
        int status = ExitFailed;
    } job{c, args};
    pthread_attr_t attr;
    pthread_t thread;
    const bool made = pthread_attr_init(&attr) == 0 && pthread_attr_setstacksize(&attr, kStackBytes) == 0 &&
                      pthread_create(
                          &thread, &attr,
                          [](void *p) -> void * {
                              auto *j = static_cast<Job *>(p);
                              j->status = RunCaught(j->command, j->args);
                              return nullptr;
                          },
                          &job) == 0;
    pthread_attr_destroy(&attr);
    if (!made) return RunCaught(c, args);
    pthread_join(thread, nullptr);
    return job.status;
}

} // namespace

const char *CommandUsage(const std::string &command) {
    for (const Command &c : kCommands)
        if (command == c.name) return c.usage;
    return "";
}

} // namespace Orvane::Cli

int main(int argc, char **argv) {
    using namespace Orvane::Cli;
    std::vector<std::string> args(argv + 1, argv + argc);
    if (args.empty()) {
        PrintUsage(stdout);
        return ExitUsage;
    }
    std::string command = args[0];
    args.erase(args.begin());
    if (command == "--help" || command == "-h" || command == "help") {
        if (!args.empty() && *CommandUsage(args[0])) {
            std::fputs(CommandUsage(args[0]), stdout);
        } else {
            PrintUsage(stdout);
        }
        return ExitOk;
    }
    if (command == "--version") command = "version";
    for (const Command &c : kCommands) {
        if (command != c.name) continue;
        // A script's own arguments (after its file) are the script's, --help among them.
        std::vector<std::string> own = args;
        if (command == "script") {
            const auto file =
                std::find_if(own.begin(), own.end(), [](const std::string &a) { return a.rfind("-", 0) != 0; });
            own.erase(file, own.end());
        }
        if (AsksForHelp(own)) {
            std::fputs(c.usage, stdout);
            return ExitOk;
        }
        return RunOnDeepStack(c, args);
    }
    std::vector<std::string> names;
    for (const Command &c : kCommands) names.push_back(c.name);
    std::fprintf(stderr, "ERROR: unknown command '%s'%s (see orvane --help)\n", command.c_str(),
                 Orvane::DidYouMean(command, names).c_str());
    return ExitUsage;
}
