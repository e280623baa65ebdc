#pragma once
// Shared pieces of the benchmarks: the UHD test frame, a tool that hands it
// on, loading the tool library, and the pixels/s counter.
#include <utility>
#include <vector>

#include <benchmark/benchmark.h>

#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"

namespace Orvane::Bench {

constexpr int kWidth = 3840, kHeight = 2160;

/// A UHD RGBA float32 frame of smooth ramps with some variation, alpha 1.
const Ref<Image> &UhdFrame();

/// Loads the tool library; on failure marks the benchmark skipped and says no.
bool LoadLibrary(benchmark::State &state);

/// Adds a tool that outputs UhdFrame() (its windows only in pre-calculation).
Output *AddFrameSource(OrvaneDoc &doc);
/// The same for any image (null: UhdFrame()), as the tool `name`.
Output *AddImageSource(OrvaneDoc &doc, Ref<Image> image, const char *name);

/// Adds a tool of class `classId` reading the frame on its first main input,
/// with the number inputs `numbers` set; null, with the benchmark marked
/// skipped, when it cannot.
Operator *AddToolOnFrame(benchmark::State &state, OrvaneDoc &doc, const char *classId,
                         const std::vector<std::pair<const char *, double>> &numbers);

/// Reports pixels per second for a UHD frame per iteration.
void ReportPixels(benchmark::State &state);

/// Renders `tool`'s main output once per iteration with the cache off, so
/// what is timed is what a render pays.
void RenderLoop(benchmark::State &state, Operator *tool);

} // namespace Orvane::Bench
