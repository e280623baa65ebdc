// File LUT with a 33-point 3D table (.cube, trilinear) on a UHD RGBA float32
// frame through the engine, cache off. Compare with BM_CopyFloor
// (CopyBench.cpp), the memory-bandwidth floor.
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <unistd.h>

#include "bench/BenchSupport.h"
#include "host/flow/Parameter.h"

namespace Orvane::Bench {
namespace {

/// A smooth look with cross-talk between the channels, as a 33-point cube.
std::string WriteCube33() {
    const std::string path =
        (std::filesystem::temp_directory_path() / ("orvane-bench-" + std::to_string(::getpid()) + ".cube")).string();
    std::ofstream f(path);
    const int n = 33;
    f << "LUT_3D_SIZE " << n << "\n";
    for (int b = 0; b < n; ++b)
        for (int g = 0; g < n; ++g)
            for (int r = 0; r < n; ++r) {
                const double x = r / (n - 1.0), y = g / (n - 1.0), z = b / (n - 1.0);
                f << std::pow(x, 0.8) * 0.9 + 0.1 * y << " " << 0.2 * x + 0.8 * std::sqrt(y) << " " << z * z << "\n";
            }
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
    const std::string cube = WriteCube33();
    lut->FindInput("Input")->ConnectTo(source);
    lut->FindInput("LUTFile")->SetValue(MakeRef<Text>(cube));
    RenderLoop(state, lut);
    std::remove(cube.c_str());
}
BENCHMARK(BM_FileLUT_Cube33)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
