#include "bench/PeerSupport.h"

#include <benchmark/benchmark.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <map>
#include <memory>
#include <regex>
#include <vector>

namespace Orvane::Bench {
namespace {

namespace fs = std::filesystem;

/// A folder for the run's peer files, removed at exit.
const fs::path &PeerFolder() {
    static const fs::path folder = [] {
        fs::path p = fs::temp_directory_path() / ("orvane-peer-" + std::to_string(::getpid()));
        fs::create_directories(p);
        std::atexit([] {
            std::error_code ec;
            fs::remove_all(PeerFolder(), ec);
        });
        return p;
    }();
    return folder;
}

/// Runs a command, returning its exit status and what it printed.
int Capture(const std::string &command, std::string &output) {
    output.clear();
    FILE *pipe = ::popen((command + " 2>&1").c_str(), "r");
    if (!pipe) return -1;
    std::array<char, 4096> buf{};
    size_t n;
    while ((n = std::fread(buf.data(), 1, buf.size(), pipe)) > 0) output.append(buf.data(), n);
    return ::pclose(pipe);
}

double Seconds(std::chrono::steady_clock::time_point since) {
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - since).count();
}

/// The time oiiotool's --runstats gives for operation `op`, negative if absent.
double RunstatsSeconds(const std::string &output, const std::string &op) {
    // Lines read "-blur : 31.92" or "resize : 1.86" (with or without the dash).
    const std::regex line("(^|\\s)-?" + op + R"(\s*:\s*([0-9.]+))");
    std::smatch m;
    return std::regex_search(output, m, line) ? std::stod(m[2].str()) : -1.0;
}

/// Whole-process time of copying the vips frame to a new file: what a vips
/// row pays besides its operation.
double VipsCopySeconds() {
    static const double seconds = [] {
        const std::string &in = PeerUHDFrame(".v");
        if (in.empty()) return -1.0;
        double best = -1.0;
        for (int i = 0; i < 3; ++i) {
            const double s = RunPeerSeconds("vips copy " + in + " " + PeerOutput(".v"));
            if (s >= 0 && (best < 0 || s < best)) best = s;
        }
        return best;
    }();
    return seconds;
}

} // namespace

int CapturePeer(const std::string &command, std::string &output) { return Capture(command, output); }

bool PeerAvailable(const char *program) {
    std::string out;
    return Capture(std::string("command -v ") + program, out) == 0;
}

const std::string &PeerUHDFrame(const char *ext) {
    static std::map<std::string, std::string> frames;
    auto it = frames.find(ext);
    if (it != frames.end()) return it->second;
    std::string path;
    const fs::path exr = PeerFolder() / "uhd.exr";
    if (PeerAvailable("oiiotool")) {
        if (!fs::exists(exr) &&
            RunPeerSeconds("oiiotool --pattern "
                           "fill:topleft=0.1,0.2,0.3,1:topright=0.9,0.1,0.2,1:bottomleft=0.2,0.8,0.1,1:bottomright=0.7,"
                           "0.6,0.9,1 3840x2160 4 -d float --compression none -o " +
                           exr.string()) < 0)
            fs::remove(exr);
        if (fs::exists(exr)) {
            if (std::string(ext) == ".exr") {
                path = exr.string();
            } else if (std::string(ext) == ".v" && PeerAvailable("vips")) {
                const fs::path v = PeerFolder() / "uhd.v";
                if (RunPeerSeconds("vips copy " + exr.string() + " " + v.string()) >= 0) path = v.string();
            }
        }
    }
    return frames[ext] = path;
}

std::string PeerOutput(const char *ext) {
    static int counter = 0;
    return (PeerFolder() / ("out" + std::to_string(counter++ % 4) + ext)).string();
}

double RunPeerSeconds(const std::string &command) {
    std::string out;
    const auto start = std::chrono::steady_clock::now();
    const int status = Capture(command, out);
    const double s = Seconds(start);
    return status == 0 ? s : -1.0;
}

void RegisterPeerBenchmark(const std::string &name, const char *program, std::function<std::string()> args,
                           const std::string &oiiotoolOp) {
    const std::string prog = program;
    benchmark::RegisterBenchmark(("Peer/" + name).c_str(),
                                 [prog, args, oiiotoolOp](benchmark::State &state) {
                                     if (!PeerAvailable(prog.c_str())) {
                                         state.SkipWithError((prog + " is not installed").c_str());
                                         return;
                                     }
                                     const std::string a = args();
                                     if (a.empty()) {
                                         state.SkipWithError("the peer's input frame could not be made");
                                         return;
                                     }
                                     const bool runstats = prog == "oiiotool" && !oiiotoolOp.empty();
                                     const std::string command = prog + (runstats ? " --runstats " : " ") + a;
                                     double opTotal = 0.0;
                                     int runs = 0;
                                     for (auto _ : state) {
                                         std::string out;
                                         const auto start = std::chrono::steady_clock::now();
                                         const int status = Capture(command, out);
                                         const double whole = Seconds(start);
                                         if (status != 0) {
                                             state.SkipWithError(("failed: " + command + "\n" + out).c_str());
                                             return;
                                         }
                                         state.SetIterationTime(whole);
                                         const double op = runstats ? RunstatsSeconds(out, oiiotoolOp)
                                                           : prog == "vips" && VipsCopySeconds() >= 0
                                                               ? whole - VipsCopySeconds()
                                                               : -1.0;
                                         if (op >= 0) {
                                             opTotal += op;
                                             ++runs;
                                         }
                                     }
                                     if (runs > 0) state.counters["op_s"] = opTotal / runs;
                                 })
        ->UseManualTime()
        ->Iterations(2)
        ->Unit(benchmark::kMillisecond);
}

} // namespace Orvane::Bench
