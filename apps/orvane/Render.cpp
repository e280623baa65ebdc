// orvane render: renders the Savers of a flow frame by frame, for render
// farms first. Its output and exit codes are a contract:
//   RENDER saver=<name> files=<absolute name, "####" for the number> frames=<runs> format=<class>
//   FRAME <n> done <i>/<count> saver=<name> file=<absolute path> <seconds>s
//   FRAME <n> skipped <i>/<count> saver=<name> file=<path> (exists)
//   ERROR: ... and WARNING: ... lines on stderr, then a summary; an
//   interrupted render lists each Saver's frames written and, indented
//   below, its files.
// With --log-format json every event is one JSON object per line instead,
// its facts in fields ("event", "code", "frame", "saver", "tool", "file",
// ...), the human text only under "error" or "warning".
// On a terminal (and in text form) a progress bar replaces the FRAME lines.
// Before the first frame the render checks what it will write (docs/OUTPUT.md):
// two frames or two Savers writing one file, or a file that exists and is
// not a regular one, stop it with exit 2 and nothing written.
// Exit: 0 every requested frame written (or skipped as existing), 2 bad
// command line or document, 3 a frame failed (or, with --strict-scripts, a
// raw script was refused for want of permission), 130 interrupted.
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
#include "host/media/ImageFormatList.h"
#include "host/media/OutputFile.h"
#include "host/script/ScriptPermission.h"

namespace Orvane::Cli {
namespace {

struct RenderArgs {
    std::string flow, frames, chunk, device;
    std::vector<std::string> savers, sets;
    int threads = 0, proxy = 1;
    size_t memoryLimit = 0;
    bool skipExisting = false, json = false, lenient = false, allowScripts = false, strictScripts = false;
};

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
            a.memoryLimit = ParseSize(value(), "render: --memory-limit");
        } else if (arg == "--device") {
            a.device = value();
        } else if (arg == "--skip-existing") {
            a.skipExisting = true;
        } else if (arg == "--lenient") {
            a.lenient = true;
        } else if (arg == "--allow-scripts") {
            a.allowScripts = true;
        } else if (arg == "--strict-scripts") {
            a.strictScripts = true;
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

/// A field of a JSON event: its name and its value as JSON text.
using Field = std::pair<std::string, std::string>;
Field Text(const std::string &name, const std::string &value) { return {name, JsonString(value)}; }
Field Whole(const std::string &name, int64_t value) { return {name, std::to_string(value)}; }

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
    /// A line on stdout: `text` in text form, an object of `event` and the fields in JSON.
    void Line(const std::string &event, const std::string &text, const std::vector<Field> &fields) {
        ClearBar();
        if (json_)
            Object(event, fields);
        else
            std::printf("%s\n", text.c_str());
        std::fflush(stdout);
    }
    /// An ERROR or WARNING: "KIND: text" on stderr, or in JSON an object of
    /// the event, its `code`, the fields, and the text under "error" or "warning".
    void Message(const char *kind, const std::string &code, const std::string &text, std::vector<Field> fields = {}) {
        ClearBar();
        if (json_) {
            std::string lower(kind);
            for (char &c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
            fields.insert(fields.begin(), Text("code", code));
            fields.push_back(Text(lower, text));
            Object(lower, fields);
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

private:
    static void Object(const std::string &event, const std::vector<Field> &fields) {
        std::string j = "{\"event\": " + JsonString(event);
        for (const auto &[name, value] : fields)
            if (value != "\"\"") j += ", " + JsonString(name) + ": " + value; // an unknown fact is left out
        std::printf("%s}\n", j.c_str());
    }
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

/// The tool a console line comes from: its first word ("Warning: " aside)
/// when that names a tool of the document; "" when unknown.
std::string ToolOfLine(const OrvaneDoc &doc, std::string text) {
    if (text.rfind("Warning: ", 0) == 0) text.erase(0, 9);
    const std::string word = text.substr(0, text.find_first_of(" :"));
    return !word.empty() && doc.FindTool(word) ? word : std::string();
}

/// Checks what the Savers will write over `frames` before anything is
/// written: a file name and a format that writes for each, no file written
/// twice, nothing but regular files replaced. Says which files each Saver
/// writes (RENDER lines) when all is well; false after the errors otherwise.
bool CheckOutputs(const std::vector<Operator *> &savers, const std::vector<int64_t> &frames, const RenderTask &task,
                  Log &log) {
    namespace fs = std::filesystem;
    bool ok = true;
    auto refuse = [&](const std::string &code, const std::string &text, std::vector<Field> fields) {
        log.Message("ERROR", code, text + "; nothing was written", std::move(fields));
        ok = false;
    };
    const double first = frames.empty() ? 0.0 : static_cast<double>(frames.front());
    std::vector<std::pair<std::string, std::vector<Field>>> lines;
    for (Operator *saver : savers) {
        const std::string pattern = saver->FrameFilePattern(first, &task);
        if (pattern.empty()) {
            refuse("no_file_name", "Saver " + saver->Name() + " has no file name to write to",
                   {Text("saver", saver->Name())});
            continue;
        }
        const std::string files = fs::absolute(pattern).lexically_normal().string();
        Input *formatInput = saver->FindInput("OutputFormat");
        auto *format = formatInput ? dynamic_cast<const IDValue *>(formatInput->Constant().Get()) : nullptr;
        const Registry *row = format && ClassRegistry ? ClassRegistry->Find(format->value) : nullptr;
        if (!row || !row->Tags().GetBool(RegFormatCanSave)) {
            const std::string name = format ? format->value.Text() : "";
            refuse("format", "Saver " + saver->Name() + ": '" + name + "' is not a file format that can write",
                   {Text("saver", saver->Name()), Text("format", name)});
            continue;
        }
        const Registry *named = FormatRowForWriting(pattern);
        if (named && named != row) {
            const std::string ext = fs::path(pattern).extension().string();
            log.Message("WARNING", "format_mismatch",
                        "saver=" + saver->Name() + " format=" + row->ID().Text() + " extension=" + ext +
                            ": the Output Format set in the document is not the extension's (" + named->ID().Text() +
                            "); the files are written as " + row->ID().Text(),
                        {Text("saver", saver->Name()), Text("format", row->ID().Text()),
                         Text("extension", ext.empty() ? ext : ext.substr(1)),
                         Text("extension_format", named->ID().Text())});
        }
        lines.push_back({"RENDER saver=" + saver->Name() + " files=" + files + " frames=" + FrameRuns(frames) +
                             " format=" + row->ID().Text(),
                         {Text("saver", saver->Name()), Text("files", files), Text("frames", FrameRuns(frames)),
                          Text("format", row->ID().Text())}});
    }
    if (!ok) return false;

    // Every file once, and only over regular files. A problem is reported
    // once per Saver (or pair of Savers) with its first file and a count.
    struct Writer {
        const Operator *saver;
        int64_t frame;
    };
    struct Problem {
        std::string code, file, why;
        Writer a, b;
        size_t count = 0;
    };
    std::map<std::string, Writer> writers;
    std::map<std::pair<const Operator *, const Operator *>, Problem> problems;
    auto note = [&](Problem p) {
        Problem &slot = problems[{p.a.saver, p.b.saver}];
        if (!slot.count) slot = std::move(p);
        ++slot.count;
    };
    for (Operator *saver : savers)
        for (int64_t frame : frames) {
            const std::string path = fs::absolute(saver->FrameFileName(static_cast<double>(frame), &task)).string();
            std::string target, error;
            if (!ResolveOutputFile(path, target, error)) {
                note({"not_regular_file", path, error, {saver, frame}, {nullptr, 0}});
                continue;
            }
            std::error_code ec;
            const fs::path key = fs::weakly_canonical(target, ec);
            const auto [it, added] = writers.insert({ec ? target : key.string(), {saver, frame}});
            if (!added) note({"same_file", path, "", it->second, {saver, frame}});
        }
    for (const auto &entry : problems) {
        const Problem &p = entry.second;
        const std::string more = p.count > 1 ? " (and " + std::to_string(p.count - 1) + " more like it)" : "";
        std::vector<Field> fields{Text("saver", p.a.saver->Name()), Whole("frame", p.a.frame), Text("file", p.file),
                                  Whole("count", static_cast<int64_t>(p.count))};
        if (p.code == "not_regular_file") {
            refuse(p.code, "Saver " + p.a.saver->Name() + ", frame " + std::to_string(p.a.frame) + ": " + p.why + more,
                   fields);
        } else if (p.a.saver == p.b.saver) {
            fields.push_back(Whole("other_frame", p.b.frame));
            refuse(p.code,
                   "Saver " + p.a.saver->Name() + " would write frames " + std::to_string(p.a.frame) + " and " +
                       std::to_string(p.b.frame) + " to the same file " + p.file + more,
                   fields);
        } else {
            fields.push_back(Text("other_saver", p.b.saver->Name()));
            fields.push_back(Whole("other_frame", p.b.frame));
            refuse(p.code,
                   "Savers " + p.a.saver->Name() + " (frame " + std::to_string(p.a.frame) + ") and " +
                       p.b.saver->Name() + " (frame " + std::to_string(p.b.frame) + ") would both write " + p.file +
                       more,
                   fields);
        }
    }
    if (!ok) return false;
    for (const auto &[text, fields] : lines) log.Line("render", text, fields);
    return true;
}

double PeakMemoryMiB() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    return usage.ru_maxrss / 1024.0; // kilobytes on Linux
}

} // namespace

int RunRender(const std::vector<std::string> &rawArgs) {
    const RenderArgs a = ParseArgs(rawArgs);
    if (a.threads) SetWorkerCount(a.threads);
    SetAllowScripts(a.allowScripts || AllowScriptsPreference());
    const long long refusedBefore = ScriptRefusals();
    LoadLibrary();

    OrvaneDoc doc;
    std::vector<std::string> console;
    std::mutex consoleLock;
    doc.SetConsoleListener([&](const ConsoleLine &line) {
        std::lock_guard<std::mutex> guard(consoleLock);
        console.push_back((line.code >= ConsoleError ? "E" : line.code >= ConsoleWarning ? "W" : "L") + line.text);
    });
    LoadFlow(a.flow, doc, a.lenient, a.json);
    for (const std::string &set : a.sets) ApplySet(doc, set);

    const std::vector<Operator *> savers = ChooseSavers(doc, a.savers, "render", a.flow);
    std::vector<int64_t> frames = RenderFrames(doc, a.frames, "render");
    RenderTask task;
    SpanWholeRange(task, frames);
    std::string error;
    if (!a.chunk.empty() && !TakeChunk(a.chunk, frames, error)) throw CliError(ExitUsage, "render: --chunk: " + error);

    Log log(a.json, frames.size());
    if (a.memoryLimit) {
        SetPixelMemoryLimit(a.memoryLimit, "--memory-limit");
        doc.Cache().SetBudget(a.memoryLimit / 2);
        SetPixelPoolLimit(a.memoryLimit / 4);
    }

    task.SetDevice(ChooseDevice("render", a.device, doc, a.json));
    task.proxyScale = a.proxy;
    EvalOptions options;
    options.task = &task;
    options.flags = a.proxy > 1 ? ReqFlagProxy : 0;
    if (!CheckOutputs(savers, frames, task, log)) return ExitUsage;

    g_task = &task;
    g_signals = 0;
    struct sigaction action {};
    action.sa_handler = OnSignal;
    sigemptyset(&action.sa_mask);
    struct sigaction oldInt {
    }, oldTerm{};
    sigaction(SIGINT, &action, &oldInt);
    sigaction(SIGTERM, &action, &oldTerm);

    for (Operator *op : doc.Tools()) op->OnStartRender();
    const auto started = std::chrono::steady_clock::now();
    std::map<std::string, std::vector<int64_t>> written, failed, skipped;
    std::map<std::string, std::vector<std::string>> files; // each Saver's files written, in order
    size_t index = 0, filesSeen = 0;
    bool interrupted = false;
    for (int64_t frame : frames) {
        if (g_signals.load()) {
            interrupted = true;
            break;
        }
        ++index;
        for (Operator *saver : savers) {
            const double t = static_cast<double>(frame);
            const std::string path = std::filesystem::absolute(saver->FrameFileName(t, &task)).string();
            if (a.skipExisting && std::filesystem::exists(path)) {
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
            const std::vector<Field> where{Whole("frame", frame), Text("saver", saver->Name())};
            for (const std::string &l : lines)
                if (l[0] == 'W') {
                    std::vector<Field> fields = where;
                    fields.push_back(Text("tool", ToolOfLine(doc, l.substr(1))));
                    log.Message("WARNING", "tool", l.substr(1), fields);
                }
            // The files completed, this Saver's among them even when the frame was abandoned.
            bool wrote = false;
            for (const RenderTask::WrittenFile &f : task.FilesWritten(filesSeen)) {
                ++filesSeen;
                const std::string absolute = std::filesystem::absolute(f.path).string();
                std::vector<std::string> &list = files[f.tool];
                if (std::find(list.begin(), list.end(), absolute) == list.end()) list.push_back(absolute);
                wrote = wrote || f.tool == saver->Name();
            }
            if (wrote) {
                written[saver->Name()].push_back(frame);
                log.Frame(frame, "done", index, saver->Name(), path, seconds);
            }
            if (task.IsAborted()) {
                interrupted = true;
                break;
            }
            if (!wrote) {
                std::string why, tool;
                for (const std::string &l : lines)
                    if (l[0] == 'E') {
                        why += (why.empty() ? "" : "; ") + l.substr(1);
                        if (tool.empty()) tool = ToolOfLine(doc, l.substr(1));
                    }
                if (why.empty()) why = result ? "the Saver wrote no file" : "no image reached the Saver";
                failed[saver->Name()].push_back(frame);
                std::vector<Field> fields = where;
                fields.push_back(Text("tool", tool));
                fields.push_back(Text("file", path));
                log.Message("ERROR", "frame_failed",
                            "frame " + std::to_string(frame) + " saver=" + saver->Name() + ": " + why, fields);
            }
        }
        if (interrupted) break;
    }
    for (Operator *op : doc.Tools()) op->OnEndRender();
    for (const std::string &line : task.DeviceLog()) {
        const std::string name = line.substr(0, line.find(": "));
        log.Message("WARNING", "device", "device: " + line + " (the CPU made those frames)",
                    {Text("tool", doc.FindTool(name) ? name : std::string())});
    }
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
        auto table = [](const auto &map, auto value) {
            std::string j = "{";
            for (const auto &[k, v] : map) j += (j.size() > 1 ? ", " : "") + JsonString(k) + ": " + value(v);
            return j + "}";
        };
        auto runs = [](const std::vector<int64_t> &v) { return JsonString(FrameRuns(v)); };
        auto list = [](const std::vector<std::string> &v) {
            std::string j = "[";
            for (const std::string &f : v) j += (j.size() > 1 ? ", " : "") + JsonString(f);
            return j + "]";
        };
        std::printf(
            "{\"event\": \"summary\", \"written\": %zu, \"failed\": %zu, \"skipped\": %zu, \"interrupted\": %s, "
            "\"failed_frames\": %s, \"written_frames\": %s, \"written_files\": %s, \"peak_memory_mib\": %s, "
            "\"seconds\": %s}\n",
            nWritten, nFailed, nSkipped, interrupted ? "true" : "false", table(failed, runs).c_str(),
            table(written, runs).c_str(), table(files, list).c_str(), JsonNumber(std::round(peak)).c_str(),
            JsonNumber(std::round(total * 1000) / 1000).c_str());
    } else {
        std::printf("SUMMARY written=%zu failed=%zu skipped=%zu peak_memory=%.0fMiB time=%.2fs\n", nWritten, nFailed,
                    nSkipped, peak, total);
        for (auto &[k, v] : failed) std::printf("FAILED saver=%s frames=%s\n", k.c_str(), FrameRuns(v).c_str());
        if (interrupted)
            for (auto &[k, v] : written) {
                std::printf("WRITTEN saver=%s frames=%s\n", k.c_str(), FrameRuns(v).c_str());
                for (const std::string &f : files[k]) std::printf("  %s\n", f.c_str());
            }
    }
    std::fflush(stdout);
    if (interrupted) {
        log.Message("ERROR", "interrupted", "interrupted; frames written before the stop are listed above");
        return ExitInterrupted;
    }
    if (a.strictScripts && ScriptRefusals() > refusedBefore) {
        log.Message(
            "ERROR", "scripts_refused",
            "scripts of the flow were not run (not allowed; use --allow-scripts) and --strict-scripts was given");
        return ExitFailed;
    }
    return nFailed ? ExitFailed : ExitOk;
}

} // namespace Orvane::Cli
