// orvane submit, status and resubmit: rendering a flow on a Slurm cluster as
// one job array (docs/FARM.md).
//
// submit checks the flow, writes a copy of it with every file name absolute
// into a job folder beside the outputs, with job.json (the frames, the
// chunks, the Savers, the options) and a batch script whose array tasks each
// run `orvane render COPY --frames SPEC --chunk I/N --skip-existing
// --log-format json`, and hands the script to `sbatch`. status compares the
// files the job should write with those on disk and reads the tasks' logs and
// (when its commands are reachable) Slurm's view; resubmit submits the
// chunks with missing frames again.
#include <algorithm>
#include <cctype>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <string_view>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/app/FrameSpec.h"
#include "host/core/ScriptVal.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/media/Clip.h"

namespace Orvane::Cli {
namespace {

namespace fs = std::filesystem;

constexpr int kDefaultChunkSize = 10;

// ---- small helpers ----

/// `s` as one shell word.
std::string ShellWord(const std::string &s) {
    std::string q = "'";
    for (char c : s) q += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return q + "'";
}

/// A value of an #SBATCH line: bare when plain, else quoted as for the shell (sbatch takes quotes off).
std::string SbatchWord(const std::string &s) {
    const bool plain = !s.empty() && std::all_of(s.begin(), s.end(), [](char c) {
        return std::isalnum(static_cast<unsigned char>(c)) ||
               std::string_view("-_:.,/%+=@").find(c) != std::string_view::npos;
    });
    return plain ? s : ShellWord(s);
}

std::string ReadText(const fs::path &p) {
    std::ifstream f(p, std::ios::binary);
    return {std::istreambuf_iterator<char>(f), {}};
}

void WriteText(const fs::path &p, const std::string &text) {
    const fs::path temporary = p.string() + ".orvane-tmp";
    {
        std::ofstream f(temporary, std::ios::binary | std::ios::trunc);
        f << text;
        if (!f.flush()) throw CliError(ExitFailed, "cannot write " + temporary.string());
    }
    std::error_code ec;
    fs::rename(temporary, p, ec);
    if (ec) throw CliError(ExitFailed, "cannot write " + p.string() + ": " + ec.message());
}

/// The full path of `program` found on PATH; "" when it is not there.
std::string FindOnPath(const std::string &program) {
    const char *path = std::getenv("PATH");
    std::stringstream dirs(path ? path : "");
    for (std::string dir; std::getline(dirs, dir, ':');) {
        const fs::path candidate = fs::path(dir.empty() ? "." : dir) / program;
        if (access(candidate.c_str(), X_OK) == 0 && fs::is_regular_file(candidate)) return candidate.string();
    }
    return {};
}

/// Runs a shell command line; its standard output, and its exit status (-1 when it did not run).
std::string Capture(const std::string &command, int &status) {
    std::string out;
    FILE *p = popen(command.c_str(), "r");
    if (!p) {
        status = -1;
        return out;
    }
    char buffer[4096];
    for (size_t n; (n = std::fread(buffer, 1, sizeof buffer, p)) > 0;) out.append(buffer, n);
    const int raw = pclose(p);
    status = WIFEXITED(raw) ? WEXITSTATUS(raw) : -1;
    return out;
}

// ---- JSON reading (job.json and the render's log lines) ----

/// Reads JSON text into a ScriptVal (objects and arrays as tables, null as
/// nil); false when the text is not JSON.
class JsonReader {
public:
    explicit JsonReader(const std::string &text) : s_(text) {}
    bool Read(ScriptVal &out) {
        try {
            out = Value();
            Space();
            return i_ == s_.size();
        } catch (const std::exception &) { // a bad number or escape as well as a syntax error
            return false;
        }
    }

private:
    [[noreturn]] static void Fail() { throw std::runtime_error("json"); }
    void Space() {
        while (i_ < s_.size() && std::isspace(static_cast<unsigned char>(s_[i_]))) ++i_;
    }
    bool Take(char c) {
        Space();
        if (i_ < s_.size() && s_[i_] == c) return ++i_, true;
        return false;
    }
    ScriptVal Value() {
        if (++depth_ > 64) Fail();
        Space();
        if (i_ >= s_.size()) Fail();
        ScriptVal v;
        const char c = s_[i_];
        if (c == '{') {
            ++i_;
            v = ScriptVal::Table();
            if (!Take('}')) {
                do {
                    Space();
                    const std::string key = String();
                    if (!Take(':')) Fail();
                    v.Set(key, Value());
                } while (Take(','));
                if (!Take('}')) Fail();
            }
        } else if (c == '[') {
            ++i_;
            v = ScriptVal::Table();
            if (!Take(']')) {
                do v.Append(Value());
                while (Take(','));
                if (!Take(']')) Fail();
            }
        } else if (c == '"') {
            v = ScriptVal(String());
        } else if (s_.compare(i_, 4, "true") == 0) {
            i_ += 4, v = ScriptVal(true);
        } else if (s_.compare(i_, 5, "false") == 0) {
            i_ += 5, v = ScriptVal(false);
        } else if (s_.compare(i_, 4, "null") == 0) {
            i_ += 4;
        } else {
            size_t used = 0;
            try {
                v = ScriptVal(std::stod(s_.substr(i_, 32), &used));
            } catch (...) {
                Fail();
            }
            i_ += used;
        }
        --depth_;
        return v;
    }
    std::string String() {
        if (i_ >= s_.size() || s_[i_] != '"') Fail();
        std::string out;
        for (++i_; i_ < s_.size() && s_[i_] != '"'; ++i_) {
            if (s_[i_] != '\\') {
                out += s_[i_];
                continue;
            }
            if (++i_ >= s_.size()) Fail();
            switch (s_[i_]) {
            case 'n': out += '\n'; break;
            case 't': out += '\t'; break;
            case 'r': out += '\r'; break;
            case 'b': out += '\b'; break;
            case 'f': out += '\f'; break;
            case 'u': {
                if (i_ + 4 >= s_.size()) Fail();
                const unsigned code = static_cast<unsigned>(std::stoul(s_.substr(i_ + 1, 4), nullptr, 16));
                i_ += 4;
                if (code < 0x80) {
                    out += static_cast<char>(code);
                } else if (code < 0x800) {
                    out += static_cast<char>(0xC0 | (code >> 6));
                    out += static_cast<char>(0x80 | (code & 0x3F));
                } else {
                    out += static_cast<char>(0xE0 | (code >> 12));
                    out += static_cast<char>(0x80 | ((code >> 6) & 0x3F));
                    out += static_cast<char>(0x80 | (code & 0x3F));
                }
                break;
            }
            default: out += s_[i_];
            }
        }
        if (i_ >= s_.size()) Fail();
        ++i_;
        return out;
    }
    const std::string &s_;
    size_t i_ = 0;
    int depth_ = 0;
};

std::string TextField(const ScriptVal &v, const char *key) {
    const ScriptVal *f = v.IsTable() ? v.Find(key) : nullptr;
    return f && f->IsText() ? f->AsText() : std::string();
}

double NumberField(const ScriptVal &v, const char *key, double otherwise = 0) {
    const ScriptVal *f = v.IsTable() ? v.Find(key) : nullptr;
    return f && f->IsNumber() ? f->AsNumber() : otherwise;
}

// ---- the job ----

/// What job.json holds: enough to write the batch script again and to find
/// every file the job writes.
struct Job {
    fs::path folder;
    std::string flow, source, frames, orvane;
    int chunks = 0;
    std::vector<std::string> savers;
    std::string partition, time, after;
    size_t mem = 0;
    int cpus = 0;
    struct Submission {
        std::string job, script;
        std::vector<int> tasks;
    };
    std::vector<Submission> submissions;
};

/// The frames of chunk `index` (1-based) of `count`, as `orvane render --chunk index/count` takes them.
std::vector<int64_t> ChunkFrames(const std::vector<int64_t> &frames, int index, int count) {
    std::vector<int64_t> chunk = frames;
    std::string error;
    if (!TakeChunk(std::to_string(index) + "/" + std::to_string(count), chunk, error))
        throw CliError(ExitUsage, "chunk " + std::to_string(index) + "/" + std::to_string(count) + ": " + error);
    return chunk;
}

std::string JsonList(const std::vector<std::string> &items) {
    std::string j = "[";
    for (const std::string &s : items) j += (j.size() > 1 ? ", " : "") + JsonString(s);
    return j + "]";
}

std::string JobJson(const Job &job, const std::vector<int64_t> &frames) {
    std::string j = "{\n";
    j += "  \"flow\": " + JsonString(job.flow) + ",\n";
    j += "  \"source\": " + JsonString(job.source) + ",\n";
    j += "  \"orvane\": " + JsonString(job.orvane) + ",\n";
    j += "  \"frames\": " + JsonString(job.frames) + ",\n";
    j += "  \"frame_count\": " + std::to_string(frames.size()) + ",\n";
    j += "  \"savers\": " + JsonList(job.savers) + ",\n";
    j += "  \"options\": {\"partition\": " + JsonString(job.partition) + ", \"time\": " + JsonString(job.time) +
         ", \"mem_bytes\": " + std::to_string(job.mem) + ", \"cpus\": " + std::to_string(job.cpus) +
         ", \"after\": " + JsonString(job.after) + "},\n";
    j += "  \"chunk_count\": " + std::to_string(job.chunks) + ",\n  \"chunks\": [\n";
    for (int i = 1; i <= job.chunks; ++i)
        j += "    {\"chunk\": " + std::to_string(i) + ", \"task\": " + std::to_string(i - 1) +
             ", \"frames\": " + JsonString(FrameRuns(ChunkFrames(frames, i, job.chunks))) + "}" +
             (i < job.chunks ? ",\n" : "\n");
    j += "  ],\n  \"submissions\": [";
    for (size_t s = 0; s < job.submissions.size(); ++s) {
        std::string tasks = "[";
        for (int t : job.submissions[s].tasks) tasks += (tasks.size() > 1 ? ", " : "") + std::to_string(t);
        j += std::string(s ? ",\n" : "\n") + "    {\"job\": " + JsonString(job.submissions[s].job) +
             ", \"script\": " + JsonString(job.submissions[s].script) + ", \"tasks\": " + tasks + "]}";
    }
    return j + (job.submissions.empty() ? "]\n}\n" : "\n  ]\n}\n");
}

Job ReadJob(const std::string &folder) {
    Job job;
    job.folder = fs::absolute(folder).lexically_normal();
    const fs::path file = job.folder / "job.json";
    if (!fs::is_regular_file(file)) throw CliError(ExitUsage, folder + " is not a job folder (no job.json)");
    ScriptVal v;
    if (!JsonReader(ReadText(file)).Read(v) || !v.IsTable())
        throw CliError(ExitUsage, file.string() + " is not a job description (not JSON)");
    job.flow = TextField(v, "flow");
    job.source = TextField(v, "source");
    job.frames = TextField(v, "frames");
    job.orvane = TextField(v, "orvane");
    job.chunks = static_cast<int>(NumberField(v, "chunk_count"));
    if (const ScriptVal *s = v.Find("savers"); s && s->IsTable())
        for (size_t i = 1; i <= s->ArrayLength(); ++i)
            if (s->At(i)->IsText()) job.savers.push_back(s->At(i)->AsText());
    if (const ScriptVal *o = v.Find("options")) {
        job.partition = TextField(*o, "partition");
        job.time = TextField(*o, "time");
        job.after = TextField(*o, "after");
        job.mem = static_cast<size_t>(NumberField(*o, "mem_bytes"));
        job.cpus = static_cast<int>(NumberField(*o, "cpus"));
    }
    if (const ScriptVal *s = v.Find("submissions"); s && s->IsTable())
        for (size_t i = 1; i <= s->ArrayLength(); ++i) {
            Job::Submission sub{TextField(*s->At(i), "job"), TextField(*s->At(i), "script"), {}};
            if (const ScriptVal *t = s->At(i)->Find("tasks"); t && t->IsTable())
                for (size_t k = 1; k <= t->ArrayLength(); ++k)
                    sub.tasks.push_back(static_cast<int>(t->At(k)->AsNumber()));
            job.submissions.push_back(std::move(sub));
        }
    if (job.flow.empty() || job.frames.empty() || job.chunks < 1 || job.orvane.empty())
        throw CliError(ExitUsage, file.string() + " lacks the flow, the frames or the chunk count");
    return job;
}

/// Where task `task`'s render writes its JSON log and its other output.
fs::path TaskLog(const Job &job, int task) {
    return job.folder / "logs" / ("chunk-" + std::to_string(task + 1) + ".json");
}
fs::path TaskErrors(const Job &job, int task) {
    return job.folder / "logs" / ("chunk-" + std::to_string(task + 1) + ".err");
}

/// The batch script of a job array of `tasks` (0-based task IDs, one per chunk).
std::string BatchScript(const Job &job, const std::vector<int> &tasks, bool dependent,
                        const std::vector<int64_t> &frames) {
    std::string array;
    for (size_t i = 0; i < tasks.size();) {
        size_t j = i;
        while (j + 1 < tasks.size() && tasks[j + 1] == tasks[j] + 1) ++j;
        array += (array.empty() ? "" : ",") + std::to_string(tasks[i]) +
                 (j > i ? "-" + std::to_string(tasks[j]) : std::string());
        i = j + 1;
    }
    const std::string logs = (job.folder / "logs").string();
    std::string s = "#!/bin/bash\n";
    s += "#SBATCH --job-name=" + SbatchWord("orvane-" + fs::path(job.flow).stem().string()) + "\n";
    s += "#SBATCH --array=" + array + "\n";
    s += "#SBATCH --output=" + SbatchWord(logs + "/slurm-%A_%a.out") + "\n";
    if (!job.partition.empty()) s += "#SBATCH --partition=" + SbatchWord(job.partition) + "\n";
    if (!job.time.empty()) s += "#SBATCH --time=" + SbatchWord(job.time) + "\n";
    const size_t mib = (job.mem + 1048575) / 1048576;
    if (job.mem) s += "#SBATCH --mem=" + std::to_string(mib) + "M\n";
    if (job.cpus) s += "#SBATCH --cpus-per-task=" + std::to_string(job.cpus) + "\n";
    if (dependent && !job.after.empty()) s += "#SBATCH --dependency=afterok:" + job.after + "\n";
    s += "# Job folder: " + job.folder.string() + " (job.json describes the chunks).\n";
    s += "# Each array task renders chunk TASK+1 of " + std::to_string(job.chunks) +
         "; frames written before stay (--skip-existing).\n";
    for (int t : tasks)
        s += "#   task " + std::to_string(t) + ": chunk " + std::to_string(t + 1) + ", frames " +
             FrameRuns(ChunkFrames(frames, t + 1, job.chunks)) + "\n";
    s += "set -u\ntask=${SLURM_ARRAY_TASK_ID:?this script runs as a task of a Slurm job array}\n";
    s += "chunk=$((task + 1))\n";
    s += "mkdir -p " + ShellWord(logs) + "\n";
    std::string render = "exec " + ShellWord(job.orvane) + " render " + ShellWord(job.flow) + " --frames " +
                         ShellWord(job.frames) + " --chunk \"$chunk/" + std::to_string(job.chunks) +
                         "\" --skip-existing --log-format json";
    for (const std::string &saver : job.savers) render += " --saver " + ShellWord(saver);
    // The image memory bound leaves a quarter of Slurm's limit to the rest of the process.
    if (job.mem) render += " --memory-limit " + std::to_string(std::max<size_t>(1, mib * 3 / 4)) + "M";
    if (job.cpus) render += " --threads " + std::to_string(job.cpus);
    render +=
        " >" + ShellWord(logs + "/chunk-") + "\"$chunk\".json 2>" + ShellWord(logs + "/chunk-") + "\"$chunk\".err";
    return s + render + "\n";
}

/// Hands a script to sbatch; the job ID. Throws when sbatch is not on PATH or refuses.
std::string Sbatch(const fs::path &script) {
    const std::string sbatch = FindOnPath("sbatch");
    if (sbatch.empty())
        throw CliError(ExitNoCluster, "sbatch is not on PATH: Slurm is not reachable from here, nothing was "
                                      "submitted (the script is " +
                                          script.string() + ")");
    int status = 0;
    const std::string out = Capture(ShellWord(sbatch) + " --parsable " + ShellWord(script.string()) + " 2>&1", status);
    std::string id = out.substr(0, out.find_first_of(";\n"));
    const bool numeric = !id.empty() && std::all_of(id.begin(), id.end(), [](char c) { return std::isdigit(c); });
    if (status != 0 || !numeric)
        throw CliError(ExitFailed, "sbatch did not take the job (exit " + std::to_string(status) + "): " + out +
                                       "nothing was submitted (the script is " + script.string() + ")");
    return id;
}

// ---- submit ----

/// Makes every file name of the document absolute: the copy lives in the job
/// folder, and relative names would be taken from there.
void MakePathsAbsolute(OrvaneDoc &doc) {
    auto absolute = [&](const std::string &name) {
        return name.empty() ? name : fs::absolute(doc.MapPath(name)).lexically_normal().string();
    };
    for (Operator *op : doc.Tools()) {
        for (const auto &in : op->Inputs()) {
            const Parameter *value = in->Constant().Get();
            if (auto *clip = dynamic_cast<const Clip *>(value); clip && !clip->FileName().empty()) {
                if (clip->FileName() == absolute(clip->FileName())) continue;
                Ref<Parameter> copy = clip->Copy();
                static_cast<Clip &>(*copy).SetFileName(absolute(clip->FileName()));
                in->SetValue(copy);
            } else if (auto *text = dynamic_cast<const Text *>(value);
                       text && !text->value.empty() && in->Tags().GetID(InputControl) == CLSID_InputControl_File) {
                if (text->value != absolute(text->value)) in->SetValue(MakeRef<Text>(absolute(text->value)));
            }
        }
        // A Loader's list of several clips.
        ScriptVal &kept = op->KeptFields();
        if (const ScriptVal *clips = kept.IsTable() ? kept.Find("Clips") : nullptr; clips && clips->IsTable()) {
            ScriptVal list = *clips;
            for (size_t i = 1; i <= list.ArrayLength(); ++i) {
                ScriptVal entry = *list.At(i);
                for (const char *key : {"Filename", "ProxyFilename"})
                    if (const ScriptVal *f = entry.IsTable() ? entry.Find(key) : nullptr; f && f->IsText())
                        entry.Set(key, ScriptVal(absolute(f->AsText())));
                list.Set(ScriptVal(static_cast<double>(i)), entry);
            }
            kept.Set("Clips", list);
        }
    }
    if (!doc.ColorConfigPath().empty()) doc.SetColorConfigPath(absolute(doc.ColorConfigPath()));
}

struct SubmitArgs {
    std::string flow, frames, partition, time, after;
    std::vector<std::string> savers;
    int chunks = 0, chunkSize = 0, cpus = 0;
    size_t mem = 0;
    bool dryRun = false;
};

SubmitArgs ParseSubmitArgs(const std::vector<std::string> &args) {
    SubmitArgs a;
    std::vector<std::string> positional;
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &arg = args[i];
        auto value = [&]() -> const std::string & {
            if (i + 1 >= args.size()) throw CliError(ExitUsage, "submit: " + arg + " needs a value");
            return args[++i];
        };
        auto whole = [&]() {
            const double n = ParseNumberList(value(), 1, arg.c_str())[0];
            if (n < 1 || n != std::floor(n) || n > 1e6)
                throw CliError(ExitUsage, "submit: " + arg + " needs a whole number >= 1");
            return static_cast<int>(n);
        };
        if (arg == "--frames")
            a.frames = value();
        else if (arg == "--chunks")
            a.chunks = whole();
        else if (arg == "--chunk-size")
            a.chunkSize = whole();
        else if (arg == "--saver")
            a.savers.push_back(value());
        else if (arg == "--partition")
            a.partition = value();
        else if (arg == "--time")
            a.time = value();
        else if (arg == "--mem")
            a.mem = ParseSize(value(), "submit: --mem");
        else if (arg == "--cpus")
            a.cpus = whole();
        else if (arg == "--after")
            a.after = value();
        else if (arg == "--dry-run")
            a.dryRun = true;
        else if (arg.rfind("--", 0) == 0)
            throw CliError(ExitUsage, "submit: unknown option " + arg);
        else
            positional.push_back(arg);
    }
    if (positional.size() != 1) throw CliError(ExitUsage, "submit: expected one FLOW document");
    if (a.chunks && a.chunkSize) throw CliError(ExitUsage, "submit: give --chunks or --chunk-size, not both");
    if (!a.after.empty() && !std::all_of(a.after.begin(), a.after.end(), [](char c) { return std::isdigit(c); }))
        throw CliError(ExitUsage, "submit: --after needs a job ID (digits)");
    for (const std::string *text : {&a.partition, &a.time})
        if (text->find_first_of("\n\r") != std::string::npos)
            throw CliError(ExitUsage, "submit: --partition and --time are one line");
    a.flow = positional[0];
    return a;
}

/// A new folder `base`-N under `parent` (N left out for the first).
fs::path NewFolder(const fs::path &parent, const std::string &base) {
    for (int n = 1;; ++n) {
        const fs::path p = parent / (n == 1 ? base : base + "-" + std::to_string(n));
        std::error_code ec;
        if (fs::create_directories(p, ec)) return p;
        if (ec) throw CliError(ExitFailed, "cannot make the job folder " + p.string() + ": " + ec.message());
    }
}

/// The program the tasks run: this one, by its absolute path.
std::string ThisProgram() {
    std::error_code ec;
    const fs::path self = fs::read_symlink("/proc/self/exe", ec);
    return ec ? std::string("orvane") : self.string();
}

// ---- status ----

/// What one chunk has written and what its task says.
struct ChunkState {
    std::vector<int64_t> frames, missing;
    std::string state, why;
    bool queued = false; ///< Slurm has the task in its queue, running or waiting
};

/// The array task numbers of a Slurm task list such as "0", "1-3" or "0,2-5%2".
std::vector<int> ArrayTasks(const std::string &list) {
    std::vector<int> tasks;
    std::stringstream parts(list.substr(0, list.find('%')));
    for (std::string part; std::getline(parts, part, ',');) {
        const char *text = part.c_str();
        char *end = nullptr;
        const int first = static_cast<int>(std::strtol(text, &end, 10));
        if (end == text) continue;
        const int last = *end == '-' ? static_cast<int>(std::strtol(end + 1, &end, 10)) : first;
        for (int t = first; t <= last && t - first < 100000; ++t) tasks.push_back(t);
    }
    return tasks;
}

/// Slurm's state of each array task of the job's submissions (latest first
/// wins); `reachable` false when Slurm's controller does not answer.
std::map<int, std::string> SlurmStates(const Job &job, bool &reachable) {
    std::map<int, std::string> states;
    const std::string squeue = FindOnPath("squeue"), scontrol = FindOnPath("scontrol"), sacct = FindOnPath("sacct");
    // Every query has a time limit: a controller that does not answer must not hold status up.
    auto query = [](const std::string &command) {
        int status = 0;
        std::string out = Capture("timeout 30 " + command + " 2>/dev/null", status);
        return status == 0 ? out : std::string();
    };
    int answered = 1;
    if (!scontrol.empty())
        Capture("timeout 30 " + ShellWord(scontrol) + " ping >/dev/null 2>&1", answered);
    else if (!squeue.empty())
        Capture("timeout 30 " + ShellWord(squeue) + " -h -o %i >/dev/null 2>&1", answered);
    reachable = answered == 0;
    if (!reachable) return states;
    for (const Job::Submission &sub : job.submissions) {
        std::map<int, std::string> found;
        // The controller remembers ended tasks for a while: one line per task, or per range of tasks
        // that were never started ("ArrayTaskId=1-3").
        auto readControl = [&](const std::string &command) {
            std::stringstream lines(query(command));
            for (std::string line; std::getline(lines, line);) {
                const size_t task = line.find(" ArrayTaskId="), state = line.find(" JobState=");
                if (task == std::string::npos || state == std::string::npos) continue;
                const std::string list = line.substr(task + 13, line.find(' ', task + 1) - task - 13);
                const std::string value = line.substr(state + 10, line.find(' ', state + 1) - state - 10);
                for (int t : ArrayTasks(list)) found.emplace(t, value);
            }
        };
        auto read = [&](const std::string &command, char separator) {
            std::stringstream lines(query(command));
            for (std::string line; std::getline(lines, line);) {
                const size_t sep = line.find(separator), under = line.find('_');
                if (sep == std::string::npos || under == std::string::npos || under > sep) continue;
                const std::string id = line.substr(under + 1, sep - under - 1), state = line.substr(sep + 1);
                if (!id.empty() && std::all_of(id.begin(), id.end(), [](char c) { return std::isdigit(c); }))
                    found.emplace(std::stoi(id), state.substr(0, state.find(' ')));
            }
        };
        // The queue knows running and pending tasks; the controller and accounting (where kept) how the
        // others ended.
        if (!squeue.empty()) read(ShellWord(squeue) + " -h -r -j " + sub.job + " -o '%i|%T'", '|');
        if (!scontrol.empty()) readControl(ShellWord(scontrol) + " -o show job " + sub.job);
        if (!sacct.empty()) read(ShellWord(sacct) + " -n -P -X -j " + sub.job + " -o JobID,State", '|');
        for (const auto &[task, state] : found) states[task] = state;
    }
    return states;
}

/// The first error a task's logs hold: the render's first error event, else
/// the first line of its other output, else the first error Slurm wrote.
std::string FirstError(const Job &job, int task, bool &finished, bool &logged) {
    finished = logged = false;
    std::ifstream log(TaskLog(job, task));
    std::string first;
    logged = bool(log);
    for (std::string line; std::getline(log, line);) {
        ScriptVal event;
        if (!JsonReader(line).Read(event)) continue;
        const std::string kind = TextField(event, "event");
        if (kind == "summary") finished = true;
        // The render's own words for a stop ("frames written before the stop are listed above") point into
        // the log; here the missing frames are listed instead.
        if (kind == "error" && first.empty())
            first = TextField(event, "code") == "interrupted" ? "the render was stopped by a signal"
                                                              : TextField(event, "error");
    }
    if (!first.empty()) return first;
    std::ifstream errors(TaskErrors(job, task));
    for (std::string line; std::getline(errors, line);)
        if (!line.empty()) return line;
    std::error_code ec;
    for (fs::directory_iterator it(job.folder / "logs", ec), end; !ec && it != end; it.increment(ec)) {
        const std::string name = it->path().filename().string();
        if (name.rfind("slurm-", 0) != 0 || name.size() < 5 ||
            name.substr(name.rfind('_') + 1) != std::to_string(task) + ".out")
            continue;
        std::ifstream slurm(it->path());
        for (std::string line; std::getline(slurm, line);)
            if (line.find("error") != std::string::npos || line.find("CANCELLED") != std::string::npos) return line;
    }
    return {};
}

/// Every chunk's state. `reachable`: whether Slurm's view was read.
std::vector<ChunkState> JobState(const Job &job, bool &reachable) {
    LoadLibrary();
    OrvaneDoc doc;
    LoadFlow(job.flow, doc, true);
    const std::vector<Operator *> savers = ChooseSavers(doc, job.savers, "status", job.flow);
    const std::vector<int64_t> frames = RenderFrames(doc, job.frames, "status");
    RenderTask task;
    SpanWholeRange(task, frames);
    const std::map<int, std::string> slurm = SlurmStates(job, reachable);
    std::vector<ChunkState> chunks;
    for (int i = 1; i <= job.chunks; ++i) {
        ChunkState c;
        c.frames = ChunkFrames(frames, i, job.chunks);
        for (int64_t frame : c.frames)
            for (Operator *saver : savers)
                if (!fs::exists(fs::absolute(saver->FrameFileName(static_cast<double>(frame), &task)))) {
                    c.missing.push_back(frame);
                    break;
                }
        const auto s = slurm.find(i - 1);
        const std::string queued = s == slurm.end() ? std::string() : s->second;
        bool finished = false, logged = false;
        const std::string error = FirstError(job, i - 1, finished, logged);
        c.queued = queued == "RUNNING" || queued == "COMPLETING" || queued == "CONFIGURING" || queued == "PENDING" ||
                   queued == "REQUEUED" || queued == "SUSPENDED";
        if (c.missing.empty()) {
            c.state = "done";
        } else if (queued == "RUNNING" || queued == "COMPLETING" || queued == "CONFIGURING") {
            c.state = "running";
        } else if (queued == "PENDING" || queued == "REQUEUED" || queued == "SUSPENDED") {
            c.state = "pending";
        } else if (finished || !queued.empty()) {
            c.state = "failed";
            c.why = (queued.empty() || queued == "COMPLETED" ? "" : "slurm: " + queued + "; ") +
                    (error.empty() ? "no error in the logs" : error);
        } else if (logged) {
            // A log without its summary: the task is rendering, or was killed before it could finish.
            c.state = reachable ? "failed" : "running";
            c.why = reachable ? (error.empty() ? "stopped before the end of its log" : error)
                              : "its log has no summary yet: rendering, or killed";
        } else {
            c.state = "pending";
        }
        chunks.push_back(std::move(c));
    }
    return chunks;
}

/// Submits `tasks` of the job with a new script; prints (or with `dryRun`
/// only shows) it. The job ID, "" for a dry run.
std::string SubmitTasks(Job &job, const std::vector<int> &tasks, bool dependent, bool dryRun,
                        const std::vector<int64_t> &frames) {
    const std::string script = BatchScript(job, tasks, dependent, frames);
    if (dryRun) {
        std::fputs(script.c_str(), stdout);
        return {};
    }
    const fs::path file = job.folder / ("submit-" + std::to_string(job.submissions.size() + 1) + ".sh");
    WriteText(file, script);
    fs::permissions(file, fs::perms::owner_exec | fs::perms::group_exec, fs::perm_options::add);
    const std::string id = Sbatch(file);
    job.submissions.push_back({id, file.filename().string(), tasks});
    WriteText(job.folder / "job.json", JobJson(job, frames));
    return id;
}

std::string OneFolderArg(const std::vector<std::string> &args, const char *command, bool &dryRun) {
    std::vector<std::string> positional;
    dryRun = false;
    for (const std::string &arg : args) {
        if (arg == "--dry-run" && std::string(command) == "resubmit")
            dryRun = true;
        else if (arg.rfind("--", 0) == 0)
            throw CliError(ExitUsage, std::string(command) + ": unknown option " + arg);
        else
            positional.push_back(arg);
    }
    if (positional.size() != 1) throw CliError(ExitUsage, std::string(command) + ": expected one JOBFOLDER");
    return positional[0];
}

} // namespace

int RunSubmit(const std::vector<std::string> &args) {
    const SubmitArgs a = ParseSubmitArgs(args);
    LoadLibrary();
    OrvaneDoc doc;
    LoadFlow(a.flow, doc, false);
    const std::vector<Operator *> savers = ChooseSavers(doc, a.savers, "submit", a.flow);
    std::vector<int64_t> frames = RenderFrames(doc, a.frames, "submit");
    if (frames.empty()) throw CliError(ExitUsage, "submit: no frames to render");
    RenderTask task;
    SpanWholeRange(task, frames);
    MakePathsAbsolute(doc);

    Job job;
    // The frames as the tasks will be told them: the document's range written out, so a later change of it
    // cannot move the chunks.
    job.frames = a.frames.empty() ? std::to_string(frames.front()) + "-" + std::to_string(frames.back()) : a.frames;
    const int size = a.chunkSize ? a.chunkSize : kDefaultChunkSize;
    job.chunks = a.chunks ? a.chunks : static_cast<int>((frames.size() + size - 1) / size);
    job.chunks = std::min<int>(job.chunks, static_cast<int>(frames.size()));
    for (Operator *saver : savers) job.savers.push_back(saver->Name());
    if (!a.savers.empty()) job.savers = a.savers;
    job.partition = a.partition, job.time = a.time, job.after = a.after, job.mem = a.mem, job.cpus = a.cpus;
    job.orvane = ThisProgram();
    job.source = fs::absolute(a.flow).lexically_normal().string();

    const std::string first = savers.front()->FrameFileName(static_cast<double>(frames.front()), &task);
    if (first.empty()) throw CliError(ExitUsage, "submit: Saver " + savers.front()->Name() + " has no file name");
    char stamp[32];
    const std::time_t now = std::time(nullptr);
    std::strftime(stamp, sizeof stamp, "%Y%m%d-%H%M%S", std::gmtime(&now));
    const std::string name = fs::path(a.flow).stem().string() + "-" + stamp;
    const fs::path parent = fs::absolute(first).parent_path() / "orvane-jobs";
    std::vector<int> tasks(job.chunks);
    for (int i = 0; i < job.chunks; ++i) tasks[i] = i;

    if (a.dryRun) {
        job.folder = parent / name;
        job.flow = (job.folder / fs::path(a.flow).filename()).string();
        // The script alone on standard output, so that it can be saved and handed to sbatch as it is.
        std::fprintf(stderr, "--dry-run: nothing written, nothing submitted\n");
        SubmitTasks(job, tasks, true, true, frames);
        return ExitOk;
    }
    // Slurm must be reachable before anything is written.
    if (FindOnPath("sbatch").empty())
        throw CliError(ExitNoCluster, "submit: sbatch is not on PATH: Slurm is not reachable from here; nothing "
                                      "was written or submitted (--dry-run shows the script)");
    job.folder = NewFolder(parent, name);
    fs::create_directories(job.folder / "logs");
    job.flow = (job.folder / fs::path(a.flow).filename()).string();
    std::string error;
    if (!SaveDocumentFile(doc, job.flow, error)) throw CliError(ExitFailed, "submit: " + error);
    WriteText(job.folder / "job.json", JobJson(job, frames));
    const std::string id = SubmitTasks(job, tasks, true, false, frames);
    std::printf("submitted job %s: %d chunks of %zu frames\njob folder: %s\n", id.c_str(), job.chunks, frames.size(),
                job.folder.string().c_str());
    return ExitOk;
}

int RunStatus(const std::vector<std::string> &args) {
    bool dryRun = false;
    const Job job = ReadJob(OneFolderArg(args, "status", dryRun));
    bool reachable = false;
    const std::vector<ChunkState> chunks = JobState(job, reachable);
    std::printf("job %s: %s\n", job.submissions.empty() ? "(not submitted)" : job.submissions.back().job.c_str(),
                job.folder.string().c_str());
    if (!reachable) std::printf("Slurm not reachable, from the logs only\n");
    size_t missing = 0, frames = 0;
    for (size_t i = 0; i < chunks.size(); ++i) {
        const ChunkState &c = chunks[i];
        missing += c.missing.size(), frames += c.frames.size();
        std::printf("chunk %zu/%zu frames %s: %s", i + 1, chunks.size(), FrameRuns(c.frames).c_str(), c.state.c_str());
        if (!c.missing.empty() && c.state != "pending") std::printf(" (missing %s)", FrameRuns(c.missing).c_str());
        if (!c.why.empty()) std::printf(": %s", c.why.c_str());
        std::printf("\n");
    }
    std::printf("%zu of %zu frames written\n", frames - missing, frames);
    return missing ? ExitFailed : ExitOk;
}

int RunResubmit(const std::vector<std::string> &args) {
    bool dryRun = false;
    Job job = ReadJob(OneFolderArg(args, "resubmit", dryRun));
    bool reachable = false;
    const std::vector<ChunkState> chunks = JobState(job, reachable);
    std::vector<int> tasks;
    for (size_t i = 0; i < chunks.size(); ++i)
        if (!chunks[i].missing.empty() && !chunks[i].queued) tasks.push_back(static_cast<int>(i));
    if (tasks.empty()) {
        std::printf("no chunk to submit: every frame is written or its task is still queued or running\n");
        return ExitOk;
    }
    if (!dryRun && FindOnPath("sbatch").empty())
        throw CliError(ExitNoCluster, "resubmit: sbatch is not on PATH: Slurm is not reachable from here; "
                                      "nothing was submitted");
    OrvaneDoc doc;
    LoadFlow(job.flow, doc, true);
    const std::vector<int64_t> frames = RenderFrames(doc, job.frames, "resubmit");
    if (dryRun) std::fprintf(stderr, "--dry-run: nothing written, nothing submitted\n");
    const std::string id = SubmitTasks(job, tasks, false, dryRun, frames);
    if (!dryRun)
        std::printf("submitted job %s: %zu chunks\njob folder: %s\n", id.c_str(), tasks.size(),
                    job.folder.string().c_str());
    return ExitOk;
}

} // namespace Orvane::Cli
