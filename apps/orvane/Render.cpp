// orvane render: renders the Savers of a flow frame by frame, for render
// farms first. Its output and exit codes are a contract:
//   FRAME <n> done <i>/<count> saver=<name> file=<absolute path> <seconds>s
//   FRAME <n> skipped <i>/<count> saver=<name> file=<path> (exists)
//   ERROR: ... and WARNING: ... lines, then a summary.
// With --log-format json every event is one JSON object per line instead.
// On a terminal (and in text form) a progress bar replaces the FRAME lines.
// Exit: 0 every requested frame written (or skipped as existing), 2 bad
// command line or document, 3 a frame failed, 130 interrupted.
#include <algorithm>
#include <atomic>
#include <chrono>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <filesystem>
#include <map>
#include <string>
#include <sys/resource.h>
#include <unistd.h>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/app/FrameSpec.h"
#include "host/core/Parallel.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/flow/ResultCache.h"
#include "host/image/PixelMemory.h"

namespace Orvane::Cli {
namespace {

struct RenderArgs {
    std::string flow, frames, chunk, device;
    std::vector<std::string> savers, sets;
    int threads = 0, proxy = 1;
    size_t memoryLimit = 0;
    bool skipExisting = false, json = false;
};

size_t ParseSize(const std::string &text) {
    size_t used = 0;
    double v = 0;
    try {
        v = std::stod(text, &used);
    } catch (...) {
        used = 0;
    }
    std::string unit = text.substr(used);
    for (char &c : unit) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    if (!unit.empty() && unit.back() == 'B') unit.pop_back();
    if (unit.size() == 2 && unit[1] == 'I') unit.pop_back();
    static const std::map<std::string, double> kUnits = {
        {"", 1.0}, {"K", 1024.0}, {"M", 1048576.0}, {"G", 1073741824.0}, {"T", 1099511627776.0}};
    const auto u = kUnits.find(unit);
    if (!used || u == kUnits.end() || !(v > 0))
        throw CliError(ExitUsage, "render: bad --memory-limit '" + text + "' (examples: 512M, 8G)");
    return static_cast<size_t>(v * u->second);
}

RenderArgs ParseArgs(const std::vector<std::string> &args) {
    RenderArgs a;
    std::vector<std::string> positional;
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &arg = args[i];
        auto value = [&]() -> const std::string & {
            if (i + 1 >= args.size()) throw CliError(ExitUsage, "render: " + arg + " needs a value");
            return args[++i];
        };
        auto whole = [&](const char *what, int low) {
            const double n = ParseNumberList(value(), 1, what)[0];
            if (n < low || n != std::floor(n) || n > 1e6)
                throw CliError(ExitUsage, "render: " + arg + " needs a whole number >= " + std::to_string(low));
            return static_cast<int>(n);
        };
        if (arg == "--frames") {
            a.frames = value();
        } else if (arg == "--chunk") {
            a.chunk = value();
        } else if (arg == "--saver") {
            a.savers.push_back(value());
        } else if (arg == "--set") {
            a.sets.push_back(value());
        } else if (arg == "--threads") {
            a.threads = whole("thread count", 1);
        } else if (arg == "--proxy") {
            a.proxy = whole("proxy scale", 1);
        } else if (arg == "--memory-limit") {
            a.memoryLimit = ParseSize(value());
        } else if (arg == "--device") {
            a.device = value();
        } else if (arg == "--skip-existing") {
            a.skipExisting = true;
        } else if (arg == "--log-format") {
            const std::string &f = value();
            if (f != "text" && f != "json") throw CliError(ExitUsage, "render: --log-format is text or json");
            a.json = f == "json";
        } else if (arg.rfind("--", 0) == 0) {
            throw CliError(ExitUsage, "render: unknown option " + arg);
        } else {
            positional.push_back(arg);
        }
    }
    if (positional.size() != 1) throw CliError(ExitUsage, "render: expected one FLOW document");
    a.flow = positional[0];
    return a;
}

// ---- interruption ----

std::atomic<int> g_signals{0};
RenderTask *g_task = nullptr;

extern "C" void OnSignal(int) {
    // The first signal stops after the frame in hand; a second one abandons it.
    if (g_signals.fetch_add(1) >= 1 && g_task) g_task->Abort();
}

/// "1001-1012,1015": a frame list in ascending runs.
std::string FrameRuns(std::vector<int64_t> frames) {
    std::sort(frames.begin(), frames.end());
    frames.erase(std::unique(frames.begin(), frames.end()), frames.end());
    std::string out;
    for (size_t i = 0; i < frames.size();) {
        size_t j = i;
        while (j + 1 < frames.size() && frames[j + 1] == frames[j] + 1) ++j;
        if (!out.empty()) out += ",";
        out += std::to_string(frames[i]);
        if (j > i) out += "-" + std::to_string(frames[j]);
        i = j + 1;
    }
    return out;
}

/// Event output: text lines, JSON lines, or a progress bar on a terminal.
class Log {
public:
    Log(bool json, size_t total) : json_(json), bar_(!json && isatty(STDOUT_FILENO)), total_(total) {}

    void Frame(int64_t frame, const char *status, size_t index, const std::string &saver, const std::string &file,
               double seconds) {
        if (json_) {
            std::printf("{\"event\": \"frame\", \"frame\": %lld, \"status\": \"%s\", \"index\": %zu, \"total\": %zu, "
                        "\"saver\": %s, \"file\": %s, \"seconds\": %s}\n",
                        static_cast<long long>(frame), status, index, total_, JsonString(saver).c_str(),
                        JsonString(file).c_str(), JsonNumber(std::round(seconds * 1000) / 1000).c_str());
        } else if (bar_) {
            Bar(index, frame);
            return;
        } else {
            std::printf("FRAME %lld %s %zu/%zu saver=%s file=%s %.2fs\n", static_cast<long long>(frame), status, index,
                        total_, saver.c_str(), file.c_str(), seconds);
        }
        std::fflush(stdout);
    }
    void Message(const char *kind, const std::string &text) {
        ClearBar();
        if (json_) {
            std::string lower(kind);
            for (char &c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
            std::printf("{\"event\": \"%s\", \"message\": %s}\n", lower.c_str(), JsonString(text).c_str());
            std::fflush(stdout);
        } else {
            std::fprintf(stderr, "%s: %s\n", kind, text.c_str());
        }
    }
    void ClearBar() {
        if (bar_ && drawn_) {
            std::fputs("\r\033[K", stdout);
            std::fflush(stdout);
            drawn_ = false;
        }
    }
    bool json() const { return json_; }

private:
    void Bar(size_t index, int64_t frame) {
        constexpr int kWidth = 40;
        const int filled = total_ ? static_cast<int>(kWidth * index / total_) : kWidth;
        std::printf("\r[%s%s] %zu/%zu frame %lld", std::string(filled, '#').c_str(),
                    std::string(kWidth - filled, ' ').c_str(), index, total_, static_cast<long long>(frame));
        std::fflush(stdout);
        drawn_ = true;
    }
    bool json_, bar_, drawn_ = false;
    size_t total_;
};

double PeakMemoryMiB() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    return usage.ru_maxrss / 1024.0; // kilobytes on Linux
}

} // namespace

int RunRender(const std::vector<std::string> &rawArgs) {
    const RenderArgs a = ParseArgs(rawArgs);
    if (a.threads) SetWorkerCount(a.threads);
    LoadLibrary();

    OrvaneDoc doc;
    std::vector<std::string> console;
    std::mutex consoleLock;
    doc.SetConsoleListener([&](const ConsoleLine &line) {
        std::lock_guard<std::mutex> guard(consoleLock);
        console.push_back((line.code >= ConsoleError ? "E" : line.code >= ConsoleWarning ? "W" : "L") + line.text);
    });
    const DocumentLoadResult loaded = LoadDocumentFile(a.flow, doc);
    if (!loaded.ok) throw CliError(ExitUsage, loaded.error);
    for (const std::string &set : a.sets) ApplySet(doc, set);

    // The Savers to render: those named, else all of them.
    std::vector<Operator *> savers;
    const OvID saverClass("Saver");
    auto isSaver = [&](const Operator *op) { return op->GetRegistry() && op->GetRegistry()->IsClassType(saverClass); };
    if (a.savers.empty()) {
        for (Operator *op : doc.Tools())
            if (isSaver(op)) savers.push_back(op);
        if (savers.empty()) throw CliError(ExitUsage, "render: " + a.flow + " has no Saver to render");
    } else {
        for (const std::string &name : a.savers) {
            Operator *op = doc.FindTool(name);
            if (!op || !isSaver(op)) throw CliError(ExitUsage, "render: the flow has no Saver '" + name + "'");
            if (std::find(savers.begin(), savers.end(), op) == savers.end()) savers.push_back(op);
        }
    }

    std::vector<int64_t> frames;
    std::string error;
    if (a.frames.empty()) {
        frames = FrameRange(static_cast<int64_t>(std::floor(doc.RenderStart())),
                            static_cast<int64_t>(std::floor(doc.RenderEnd())));
    } else if (!ParseFrameSpec(a.frames, frames, error)) {
        throw CliError(ExitUsage, "render: --frames: " + error);
    }
    // Saver-relative numbering counts from the whole range's first frame, so
    // every chunk of a job array numbers its files alike.
    const int64_t rangeStart = frames.empty() ? 0 : *std::min_element(frames.begin(), frames.end());
    if (!a.chunk.empty() && !TakeChunk(a.chunk, frames, error)) throw CliError(ExitUsage, "render: --chunk: " + error);

    for (const std::string &w : loaded.warnings) std::fprintf(stderr, "WARNING: %s\n", w.c_str());
    if (a.memoryLimit) {
        SetPixelMemoryLimit(a.memoryLimit, "--memory-limit");
        doc.Cache().SetBudget(a.memoryLimit / 2);
        SetPixelPoolLimit(a.memoryLimit / 4);
    }

    RenderTask task;
    task.SetDevice(ChooseDevice("render", a.device, doc));
    task.proxyScale = a.proxy;
    task.startTime = static_cast<double>(rangeStart);
    EvalOptions options;
    options.task = &task;
    options.flags = a.proxy > 1 ? ReqFlagProxy : 0;

    g_task = &task;
    g_signals = 0;
    struct sigaction action {};
    action.sa_handler = OnSignal;
    sigemptyset(&action.sa_mask);
    struct sigaction oldInt {
    }, oldTerm{};
    sigaction(SIGINT, &action, &oldInt);
    sigaction(SIGTERM, &action, &oldTerm);

    Log log(a.json, frames.size());
    for (Operator *op : doc.Tools()) op->OnStartRender();
    const auto started = std::chrono::steady_clock::now();
    std::map<std::string, std::vector<int64_t>> written, failed, skipped;
    size_t index = 0;
    bool interrupted = false;
    for (int64_t frame : frames) {
        if (g_signals.load()) {
            interrupted = true;
            break;
        }
        ++index;
        for (Operator *saver : savers) {
            const double t = static_cast<double>(frame);
            const std::string path = saver->FrameFileName(t, &task);
            if (a.skipExisting && !path.empty() && std::filesystem::exists(path)) {
                skipped[saver->Name()].push_back(frame);
                log.Frame(frame, "skipped", index, saver->Name(), path, 0.0);
                continue;
            }
            {
                std::lock_guard<std::mutex> guard(consoleLock);
                console.clear();
            }
            const auto t0 = std::chrono::steady_clock::now();
            Ref<Parameter> result = Evaluate(saver->FindMainOutput(), t, options);
            const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - t0).count();
            std::vector<std::string> lines;
            {
                std::lock_guard<std::mutex> guard(consoleLock);
                lines = console;
            }
            for (const std::string &l : lines)
                if (l[0] == 'W') log.Message("WARNING", l.substr(1));
            if (task.IsAborted()) {
                interrupted = true;
                break;
            }
            if (!result) {
                std::string why;
                for (const std::string &l : lines)
                    if (l[0] == 'E') why += (why.empty() ? "" : "; ") + l.substr(1);
                if (why.empty()) why = "no image reached the Saver";
                failed[saver->Name()].push_back(frame);
                log.Message("ERROR", "frame " + std::to_string(frame) + " saver=" + saver->Name() + ": " + why);
                continue;
            }
            written[saver->Name()].push_back(frame);
            log.Frame(frame, "done", index, saver->Name(), std::filesystem::absolute(path).string(), seconds);
        }
        if (interrupted) break;
    }
    for (Operator *op : doc.Tools()) op->OnEndRender();
    for (const std::string &line : task.DeviceLog())
        log.Message("WARNING", "device: " + line + " (the CPU made those frames)");
    sigaction(SIGINT, &oldInt, nullptr);
    sigaction(SIGTERM, &oldTerm, nullptr);
    g_task = nullptr;
    log.ClearBar();

    const double total = std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
    size_t nWritten = 0, nFailed = 0, nSkipped = 0;
    for (auto &[k, v] : written) nWritten += v.size();
    for (auto &[k, v] : failed) nFailed += v.size();
    for (auto &[k, v] : skipped) nSkipped += v.size();
    const double peak = PeakMemoryMiB();
    if (a.json) {
        std::string j = "{\"event\": \"summary\", \"written\": " + std::to_string(nWritten) +
                        ", \"failed\": " + std::to_string(nFailed) + ", \"skipped\": " + std::to_string(nSkipped) +
                        ", \"interrupted\": " + (interrupted ? "true" : "false") + ", \"failed_frames\": {";
        bool first = true;
        for (auto &[k, v] : failed) {
            j += (first ? "" : ", ") + JsonString(k) + ": " + JsonString(FrameRuns(v));
            first = false;
        }
        j += "}, \"written_frames\": {";
        first = true;
        for (auto &[k, v] : written) {
            j += (first ? "" : ", ") + JsonString(k) + ": " + JsonString(FrameRuns(v));
            first = false;
        }
        j += "}, \"peak_memory_mib\": " + JsonNumber(std::round(peak)) +
             ", \"seconds\": " + JsonNumber(std::round(total * 1000) / 1000) + "}";
        std::printf("%s\n", j.c_str());
    } else {
        std::printf("SUMMARY written=%zu failed=%zu skipped=%zu peak_memory=%.0fMiB time=%.2fs\n", nWritten, nFailed,
                    nSkipped, peak, total);
        for (auto &[k, v] : failed) std::printf("FAILED saver=%s frames=%s\n", k.c_str(), FrameRuns(v).c_str());
        if (interrupted)
            for (auto &[k, v] : written) std::printf("WRITTEN saver=%s frames=%s\n", k.c_str(), FrameRuns(v).c_str());
    }
    std::fflush(stdout);
    if (interrupted) {
        log.Message("ERROR", "interrupted; frames written before the stop are listed above");
        return ExitInterrupted;
    }
    return nFailed ? ExitFailed : ExitOk;
}

} // namespace Orvane::Cli
