#pragma once
// The flow engine: answers "what does this output hold at this time" by
// walking requests through the tools.
//
// The walk of one request:
//  1. A cached result whose key and region fit is returned at once.
//  2. For pixel requests, the pre-calculation pass runs first (cached): it
//     yields an image without pixels whose windows give the output's domain
//     of definition.
//  3. The tool's inputs are taken level by level, lowest priority first
//     (masks -1000, images -1, the rest 0). For each level the inputs'
//     domains are looked up, the default region (the request's) is set, the
//     tool's CheckRequest may change regions, times, or drop inputs, and then
//     the level's values are fetched: links by a request to the upstream
//     output (recursively), unlinked inputs from their constant or curve.
//  4. PreProcess, Process and PostProcess (the common controls) run; with
//     ReqFlagPreCalc their pre-calculation forms run instead.
//  5. The result is cached (unless the class says not to) and returned.
// A tool that fails hands over null; the engine stops there and returns null,
// the tool's console line telling why. An abort returns null silently.
//
// Thread safety: Evaluate may run on several threads for different tools; a
// tool handles one request at a time (its RequestLock).
#include <optional>

#include "host/flow/Parameter.h"
#include "host/image/Rect.h"

namespace Orvane {

class Output;
class RenderTask;

struct EvalOptions {
    uint32_t flags = 0;
    std::optional<ImageDomain> roi;
    RenderTask *task = nullptr;
    bool useCache = true;
    /// Requests between this one and the caller's (the engine counts). A walk
    /// deeper than MaxFlowDepth fails with a console line rather than run out
    /// of stack: each level takes about a kilobyte of the calling thread's.
    int depth = 0;
};

constexpr int MaxFlowDepth = 100000;

/// The value of `out` at `time`, or null when a tool failed. An image made
/// on the render's device is brought back into main memory.
ORVANE_API Ref<Parameter> Evaluate(Output *out, double time, const EvalOptions &options = {});
/// The same, but an image made on the device stays there (its main memory
/// stale until Image::DownloadGPUMem): for callers that pass it on to the
/// device, such as a viewer drawing from device memory.
ORVANE_API Ref<Parameter> EvaluateOnDevice(Output *out, double time, const EvalOptions &options = {});

/// Hash of everything the value of `out` at `time` depends on; absent when a
/// tool upstream gives different results for the same inputs (no caching).
/// With a task, hashes are kept in the task and worked out once.
ORVANE_API std::optional<uint64_t> StateHash(const Output *out, double time, RenderTask *task = nullptr);

} // namespace Orvane
