#pragma once
// Kernels served by C++ code instead of kernel text. A KROMComputeNode made
// with the name of a kernel that has a registered provider runs that
// provider in RunSession: the node hands it the parameter block, its named
// images and its named float lists, and the provider fills the output
// images. Providers work on the CPU (the images' rows); on a render without
// a device the node needs no context, and its buffers wrap the images
// themselves (KROMBuffer::CreateImage with a null context). A device back end
// may serve the same kernel through the same interface later.
//
// The kernel "GetObjectMask" (object mattes from strokes) takes the block
// OrvaneSemanticSegmentationParams, the images "src" and "cachePropMaskIn"
// (a 1 x 1 dummy when there is no propagated mask), the float lists
// "posStroke" and "negStroke" (x, y pairs in pixels of "src", each stroke
// ended by a pair of NaNs), and writes "cachePropMaskOut" and "dst".
//
// The registry keeps, per kernel name, providers in the order registered;
// the last one registered that says it is available serves (so a learned
// model registered after the default one takes over while it can run).
//
// Thread safety: the registry's functions may be called from any thread.
// A provider's Run may be called from several render threads at once for
// different calls.
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class Image;

/// The kernel's boolean: 32 bits wide.
using BoolType = int32_t;

/// The parameter block of "GetObjectMask", the wire format with the provider.
struct OrvaneSemanticSegmentationParams {
    uint64_t compId = 0;      ///< the document's reference
    uint32_t operatorId = 0;  ///< the tool's
    int32_t timeStamp = 0;    ///< the frame time, floored
    int32_t refineRange = 30; ///< frames the propagated mask may be refined over
    BoolType hasCachePropMask = 0;
    BoolType isBetterMode = 0;
    BoolType isTracking = 0;
    BoolType isRefframe = 0; ///< the frame the strokes were drawn on
    BoolType isKeyframe = 0; ///< a frame with strokes of its own
    BoolType isSrcPreMult = 1;
    BoolType isDstPreMult = 0;
    int32_t algoVer = 1;
};
static_assert(sizeof(OrvaneSemanticSegmentationParams) == 56);
static_assert(offsetof(OrvaneSemanticSegmentationParams, operatorId) == 8);
static_assert(offsetof(OrvaneSemanticSegmentationParams, timeStamp) == 12);
static_assert(offsetof(OrvaneSemanticSegmentationParams, refineRange) == 16);
static_assert(offsetof(OrvaneSemanticSegmentationParams, hasCachePropMask) == 20);
static_assert(offsetof(OrvaneSemanticSegmentationParams, isSrcPreMult) == 40);
static_assert(offsetof(OrvaneSemanticSegmentationParams, algoVer) == 48);

/// The kernel text of the block, as a kernel would declare it.
ORVANE_API extern const char *const OrvaneSemanticSegmentationParamsText;

/// What a provider gets from the node.
struct ProviderCall {
    std::string kernel;
    const void *block = nullptr;
    size_t blockSize = 0;
    std::map<std::string, const Image *> inputs;
    std::map<std::string, Image *> outputs; ///< rows allocated over their data windows
    std::map<std::string, std::vector<float>> floatLists;
    const std::atomic<bool> *abort = nullptr; ///< the render's abort flag, when there is one
};

class ORVANE_API KernelProvider {
public:
    virtual ~KernelProvider() = default;
    /// A short name for messages and documentation ("classical").
    virtual const char *Name() const = 0;
    /// Whether it can run here (a model file found, its libraries present).
    virtual bool Available() const { return true; }
    /// Fills the outputs; false with `error` set when it cannot.
    virtual bool Run(const ProviderCall &call, std::string &error) = 0;
    /// Drops what it keeps between the frames of a run (previous frames, flows).
    virtual void Purge() {}
};

ORVANE_API void RegisterKernelProvider(const std::string &kernel, std::shared_ptr<KernelProvider> provider);
ORVANE_API void UnregisterKernelProvider(const std::string &kernel, const KernelProvider *provider);
/// The provider that serves `kernel` now, or null.
ORVANE_API std::shared_ptr<KernelProvider> FindKernelProvider(const std::string &kernel);

/// Makes the providers of "GetObjectMask" drop what they keep between frames (at the end of a tracking run).
ORVANE_API void PurgeKROMMagicMaskTrackerCache();

} // namespace Orvane
