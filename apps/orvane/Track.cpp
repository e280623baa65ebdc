// orvane track: runs a tool's trackers (or a Magic Mask's object run) over a
// range of frames, as the track buttons do, and saves the flow with what they
// made.
#include <algorithm>
#include <atomic>
#include <csignal>
#include <cstdio>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/app/FrameSpec.h"
#include "host/core/Suggest.h"
#include "host/flow/ControlCommand.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"

namespace Orvane::Cli {
namespace {

struct TrackArgs {
    std::string flow, tool, frames, device;
    double from = 0.0;
    bool fromSet = false, reverse = false, bidirectional = false, lenient = false;
};

TrackArgs ParseTrackArgs(const std::vector<std::string> &args) {
    TrackArgs a;
    std::vector<std::string> positional;
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &arg = args[i];
        const auto value = [&]() -> const std::string & {
            if (i + 1 >= args.size()) throw CliError(ExitUsage, "track: " + arg + " needs a value");
            return args[++i];
        };
        if (arg == "--frames") {
            a.frames = value();
        } else if (arg == "--from") {
            a.from = ParseNumberList(value(), 1, "--from")[0];
            a.fromSet = true;
        } else if (arg == "--reverse") {
            a.reverse = true;
        } else if (arg == "--bidirectional") {
            a.bidirectional = true;
        } else if (arg == "--device") {
            a.device = value();
        } else if (arg == "--lenient") {
            a.lenient = true;
        } else if (arg.size() > 1 && arg[0] == '-' && arg[1] == '-') {
            throw CliError(ExitUsage, "track: unknown option " + arg);
        } else {
            positional.push_back(arg);
        }
    }
    if (positional.size() != 2) throw CliError(ExitUsage, "see orvane track --help");
    if (a.reverse && a.bidirectional)
        throw CliError(ExitUsage, "track: --reverse and --bidirectional exclude each other");
    a.flow = positional[0];
    a.tool = positional[1];
    return a;
}

std::atomic<RenderTask *> g_trackTask{nullptr};

extern "C" void OnTrackSignal(int) {
    if (RenderTask *task = g_trackTask.load()) task->Abort();
}

/// "NAME: K keys from frame A to B" for each path of the tool (inputs TrackedCenter<n>) with keys.
void ReportPaths(const Operator &op) {
    for (const auto &in : op.Inputs()) {
        const std::string id = in->ID().Text();
        if (id.rfind("TrackedCenter", 0) != 0 || !in->Curve() || in->Curve()->Empty()) continue;
        const std::string number = id.substr(13);
        std::string name = "tracker " + number;
        if (const Input *n = op.FindInput(("Name" + number).c_str()))
            if (const auto *text = dynamic_cast<const Text *>(n->ValueAt(0.0).Get())) name = text->value;
        const auto &keys = in->Curve()->Keys();
        std::printf("  %s.%s (%s): %zu keys, frames %g to %g\n", op.Name().c_str(), id.c_str(), name.c_str(),
                    keys.size(), keys.front().time, keys.back().time);
    }
}

} // namespace

int RunTrack(const std::vector<std::string> &args) {
    const TrackArgs a = ParseTrackArgs(args);
    LoadLibrary();
    OrvaneDoc doc;
    std::vector<std::string> console;
    doc.SetConsoleListener([&console](const ConsoleLine &line) { console.push_back(line.text); });
    LoadFlow(a.flow, doc, a.lenient);
    Operator *op = doc.FindTool(a.tool);
    if (!op) {
        std::vector<std::string> names;
        for (const Operator *t : doc.Tools()) names.push_back(t->Name());
        throw CliError(ExitUsage, "track: the flow has no tool '" + a.tool + "'" + DidYouMean(a.tool, names));
    }

    std::vector<int64_t> frames;
    std::string error;
    if (a.frames.empty()) {
        frames = FrameRange(static_cast<int64_t>(doc.RenderStart()), static_cast<int64_t>(doc.RenderEnd()));
    } else if (!ParseFrameSpec(a.frames, frames, error)) {
        throw CliError(ExitUsage, "track: --frames: " + error);
    }
    if (frames.empty()) throw CliError(ExitUsage, "track: no frames to track");
    const double first = static_cast<double>(*std::min_element(frames.begin(), frames.end()));
    const double last = static_cast<double>(*std::max_element(frames.begin(), frames.end()));
    // The legs of the run: from the start frame to one end of the range, and with --bidirectional back to the other.
    const double from = a.fromSet ? a.from : a.reverse ? last : first;
    std::vector<std::pair<double, double>> legs{{from, a.reverse ? first : last}};
    if (a.bidirectional) legs.push_back({from, first});

    RenderTask task;
    task.SetDevice(ChooseDevice("track", a.device, doc));
    task.startTime = first;
    task.endTime = last;
    g_trackTask = &task;
    struct sigaction action {};
    action.sa_handler = OnTrackSignal;
    sigemptyset(&action.sa_mask);
    struct sigaction oldInt {
    }, oldTerm{};
    sigaction(SIGINT, &action, &oldInt);
    sigaction(SIGTERM, &action, &oldTerm);
    bool tracked = false;
    for (const auto &[start, end] : legs) {
        if (task.IsAborted()) break;
        const size_t seen = console.size();
        if (op->ControlCommand(
                CCMD_Track,
                {{CCMD_TrackFrom, start}, {CCMD_TrackTo, end}, {CCMD_TrackTask, static_cast<const void *>(&task)}})) {
            tracked = true;
            std::printf("tracked %s from frame %g to %g\n", op->Name().c_str(), start, end);
        } else if (console.size() == seen) {
            throw CliError(ExitUsage, "track: " + a.tool + " (" + op->ClassID().Text() + ") has no trackers");
        } else {
            // Every line of the leg: a failing upstream tool says why before the tracker says it tracked nothing.
            for (size_t i = seen; i < console.size(); ++i) {
                const std::string &line = console[i];
                std::fprintf(stderr, "ERROR: track: %s%s", line.c_str(),
                             !line.empty() && line.back() == '\n' ? "" : "\n");
            }
        }
    }
    op->OnEndRender(); // a run a tool keeps open between legs ends with the command
    sigaction(SIGINT, &oldInt, nullptr);
    sigaction(SIGTERM, &oldTerm, nullptr);
    g_trackTask = nullptr;
    ReportDeviceLog(task);
    if (!tracked) return ExitFailed;
    // What was tracked is kept, an interrupted run's included.
    if (!SaveDocumentFile(doc, a.flow, error)) throw CliError(ExitFailed, error);
    ReportPaths(*op);
    if (task.IsAborted()) {
        std::fprintf(stderr, "track: interrupted; the paths tracked so far are saved\n");
        return ExitInterrupted;
    }
    return ExitOk;
}

} // namespace Orvane::Cli
