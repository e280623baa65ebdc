// How good the keyers' mattes are: each keyer on the synthetic keying plates
// (tests/support/KeyPlates.h: a foreground of exact alpha with hard and soft
// edges, hair, a motion-blurred edge and veils over an unevenly lit screen,
// with spill and grain), 1920x1080, green and blue, with the settings a
// compositor would start from, the screen colour being the plate's mean
// screen colour as a pick over bare screen gives it. Each row's time is the
// keyer's render; its counters are the matte's errors against the true alpha:
//   mean_err  mean |alpha - true alpha| over the frame
//   edge_err  the same over the edge pixels (0 < true alpha < 1)
//   worst_err the largest
//   edge_colour  how far the keyed colour stays from the true unspilled
//             foreground where the spill reaches (EdgeColourDistance; the
//             Ultra and Chroma Keyers post-multiply for it), beside
//             spilled, the same for the foreground as the screen lit it
// Rows: Delta (the screen colour alone), DeltaClean (with the clean screen
// as clean plate, threshold 0.1..0.9 and fringe restore), Ultra (screen
// colour, background subtracted), Chroma (ranges 0.06 around the screen's
// chroma axes, any luminance, soft range 0.1), Difference (against the clean
// screen, Low 0.02, High 0.25). The comparison with an open peer keyer is
// scripts/key-quality.sh (a whole program against a whole program).
#include <cmath>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"
#include "host/flow/Engine.h"
#include "host/flow/InputValue.h"
#include "host/flow/Link.h"
#include "tests/support/KeyPlates.h"

namespace Orvane::Bench {
namespace {

namespace kp = Orvane::Test;

const kp::KeyPlate &Plate(kp::ScreenColor screen) {
    static std::map<kp::ScreenColor, kp::KeyPlate> plates;
    auto it = plates.find(screen);
    if (it == plates.end())
        it = plates.emplace(screen, kp::MakeKeyPlate(kp::KeyPlateKind::Everything, screen, 1920, 1080, 11)).first;
    return it->second;
}

using Settings = std::vector<std::pair<const char *, double>>;

/// The screen colour on a keyer's Background colour control.
Settings ScreenColour(const kp::KeyPlate &p) {
    return {{"BackgroundRed", p.screenR}, {"BackgroundGreen", p.screenG}, {"BackgroundBlue", p.screenB}};
}

/// Ranges 0.06 either side of the screen colour's chroma axes, luminance open.
Settings ChromaRanges(const kp::KeyPlate &p) {
    const double y = 0.299 * p.screenR + 0.587 * p.screenG + 0.114 * p.screenB;
    const double axes[3] = {(p.screenR - y) * 0.61035 + 0.5, (p.screenG - y) * 0.76294 + 0.5,
                            (p.screenB - y) * 0.45776 + 0.5};
    return {{"RedLow", axes[0] - 0.06},    {"RedHigh", axes[0] + 0.06}, {"GreenLow", axes[1] - 0.06},
            {"GreenHigh", axes[1] + 0.06}, {"BlueLow", axes[2] - 0.06}, {"BlueHigh", axes[2] + 0.06},
            {"LuminanceLow", 0.0},         {"LuminanceHigh", 1.0},      {"SoftRange", 0.1}};
}

enum class Keyer { Delta, DeltaClean, Ultra, Chroma, Difference };

void BM_KeyQuality(benchmark::State &state, Keyer keyer, kp::ScreenColor screen) {
    if (!LoadLibrary(state)) return;
    const kp::KeyPlate &plate = Plate(screen);
    OrvaneDoc doc;
    Output *composite = AddImageSource(doc, plate.composite, "Plate");
    Output *clean = AddImageSource(doc, plate.cleanScreen, "CleanScreen");
    static const char *const classes[] = {"DeltaKeyer", "DeltaKeyer", "UltraKeyer", "ChromaKeyer", "DifferenceKeyer"};
    Operator *tool = doc.AddTool(OvID(classes[static_cast<int>(keyer)]));
    if (!composite || !clean || !tool) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    Settings settings;
    bool linked = true;
    switch (keyer) {
    case Keyer::Delta:
        settings = ScreenColour(plate);
        linked = tool->FindInput("Input")->ConnectTo(composite);
        break;
    case Keyer::DeltaClean:
        settings = ScreenColour(plate);
        settings.insert(settings.end(), {{"LowThreshold", 0.1}, {"HighThreshold", 0.9}, {"RestoreFringe", 0.003}});
        linked = tool->FindInput("Input")->ConnectTo(composite) && tool->FindInput("Clean")->ConnectTo(clean);
        break;
    case Keyer::Ultra:
        settings = ScreenColour(plate);
        settings.push_back({"PostMultiplyImage", 1.0});
        linked = tool->FindInput("Input")->ConnectTo(composite);
        break;
    case Keyer::Chroma:
        settings = ChromaRanges(plate);
        settings.push_back({"PostMultiplyImage", 1.0});
        linked = tool->FindInput("Input")->ConnectTo(composite);
        break;
    case Keyer::Difference:
        settings = {{"Low", 0.02}, {"High", 0.25}};
        linked = tool->FindInput("Background")->ConnectTo(clean) && tool->FindInput("Foreground")->ConnectTo(composite);
        break;
    }
    for (const auto &[id, value] : settings) tool->FindInput(id)->SetValue(MakeRef<Number>(value));
    if (!linked) {
        state.SkipWithError("cannot link the plate");
        return;
    }
    Ref<Parameter> result;
    for (auto _ : state) {
        EvalOptions options;
        options.useCache = false;
        result = Evaluate(tool->FindMainOutput(), 0.0, options);
        benchmark::DoNotOptimize(result.Get());
    }
    const auto *matte = dynamic_cast<const Image *>(result.Get());
    if (!matte) {
        state.SkipWithError("the keyer gave no image");
        return;
    }
    const kp::MatteScore score = kp::ScoreMatte(*matte, *plate.trueAlpha);
    state.counters["mean_err"] = score.meanError;
    state.counters["edge_err"] = score.edgeMeanError;
    state.counters["worst_err"] = score.worstError;
    if (keyer != Keyer::Difference) {
        state.counters["edge_colour"] = kp::EdgeColourDistance(*matte, plate);
        state.counters["spilled"] = kp::EdgeColourDistance(*plate.spilledForeground, plate);
    }
}

void RegisterRows() {
    static const std::pair<const char *, Keyer> keyers[] = {{"Delta", Keyer::Delta},
                                                            {"DeltaClean", Keyer::DeltaClean},
                                                            {"Ultra", Keyer::Ultra},
                                                            {"Chroma", Keyer::Chroma},
                                                            {"Difference", Keyer::Difference}};
    for (const auto &[name, keyer] : keyers)
        for (kp::ScreenColor screen : {kp::ScreenColor::Green, kp::ScreenColor::Blue}) {
            const std::string row =
                std::string("KeyQuality/") + name + (screen == kp::ScreenColor::Green ? "/green" : "/blue");
            benchmark::RegisterBenchmark(row.c_str(), BM_KeyQuality, keyer, screen)
                ->UseRealTime()
                ->Unit(benchmark::kMillisecond)
                ->Iterations(3);
        }
}
const bool kRegistered = (RegisterRows(), true);

} // namespace
} // namespace Orvane::Bench
