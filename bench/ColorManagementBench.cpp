// File LUT with a 33-point 3D table (.cube, trilinear) on a UHD RGBA float32
// frame through the engine, cache off. Compare with BM_CopyFloor
// (CopyBench.cpp), the memory-bandwidth floor, and with
// Peer/oiiotool_ociofiletransform_cube33, the same table applied by
// oiiotool to the same size of frame in the same run (op_s: its own time for
// the transform alone, from --runstats).
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <unistd.h>
#include <vector>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/color/ColorConfig.h"
#include "host/flow/Parameter.h"

namespace Orvane::Bench {
namespace {

/// A temporary file of this run, written by `write`; removed at exit.
std::string RunFile(const char *name, void (*write)(std::ofstream &)) {
    static std::vector<std::string> made;
    static const bool removedAtExit = std::atexit([] {
                                          for (const std::string &p : made) std::remove(p.c_str());
                                      }) == 0;
    (void)removedAtExit;
    made.push_back(
        (std::filesystem::temp_directory_path() / ("orvane-bench-" + std::to_string(::getpid()) + "-" + name))
            .string());
    std::ofstream f(made.back());
    write(f);
    return made.back();
}

/// A smooth look with cross-talk between the channels, as a 33-point cube.
const std::string &Cube33() {
    static const std::string path = RunFile("look.cube", [](std::ofstream &f) {
        const int n = 33;
        f << "LUT_3D_SIZE " << n << "\n";
        for (int b = 0; b < n; ++b)
            for (int g = 0; g < n; ++g)
                for (int r = 0; r < n; ++r) {
                    const double x = r / (n - 1.0), y = g / (n - 1.0), z = b / (n - 1.0);
                    f << std::pow(x, 0.8) * 0.9 + 0.1 * y << " " << 0.2 * x + 0.8 * std::sqrt(y) << " " << z * z
                      << "\n";
                }
    });
    return path;
}

void BM_FileLUT_Cube33(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Output *source = AddFrameSource(doc);
    Operator *lut = doc.AddTool(OvID("FileLUT"));
    if (!source || !lut) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    lut->FindInput("Input")->ConnectTo(source);
    lut->FindInput("LUTFile")->SetValue(MakeRef<Text>(Cube33()));
    RenderLoop(state, lut);
}
BENCHMARK(BM_FileLUT_Cube33)->UseRealTime()->Unit(benchmark::kMillisecond);

// The same cube through oiiotool, on a UHD float frame of its own, with our
// built-in configuration (oiiotool wants one for file transforms).
const bool kPeerRegistered = [] {
    RegisterPeerBenchmark(
        "oiiotool_ociofiletransform_cube33", "oiiotool",
        [] {
            const std::string &in = PeerUHDFrame(".exr");
            if (in.empty()) return std::string();
            static const std::string config =
                RunFile("config.ocio", [](std::ofstream &f) { f << ColorConfig::BuiltInText(); });
            return "--colorconfig " + config + " " + in + " --ociofiletransform " + Cube33() +
                   " -d float --compression none -o " + PeerOutput(".exr");
        },
        "ociofiletransform");
    return true;
}();

} // namespace
} // namespace Orvane::Bench
