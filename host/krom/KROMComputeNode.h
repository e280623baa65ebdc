#pragma once
// KROMComputeNode: one kernel run on one device context.
//
// The long form, on the device thread (RenderTask::Execute):
//   auto node = KROMComputeNode::Create(ctx, "Name", source, NameParamsText, false);
//   auto in = KROMBuffer::CreateImage(ctx, src, KROMBufferRead);
//   auto out = KROMBuffer::CreateImage(ctx, dst, KROMBufferWrite);
//   if (node->IsValid() && in->IsValid() && out->IsValid()) {
//       node->SetParamStruct(block, sizeof(NameParams));
//       node->AddInput("input", in.get());
//       node->AddOutput("output", out.get());
//       if (node->RunSession()) dst->SetGPUMem(out->GetGPUMemory(), true);
//   }
// Arguments are bound by the names the kernel text gives its parameters; the
// parameter block is always the first. A null source, or the option
// "KROM_RT_UseOrvaneCommonKernel" set to 1, takes the kernel of that name from
// the host's common kernel library (CommonKernels.h).
//
// ExecKernelI is the short form for one kernel over images: it finds the
// request's render task, runs the steps above on its device thread, fills in
// the component orders at the given offsets of the block, and gives the
// output image its device memory.
//
// A kernel with a registered provider (KernelProvider.h) needs no context
// and no text: RunSession hands the block, the images of host buffers and
// the float lists to the provider.
//
// Ownership: the caller owns the node; the block is shared, so that it lives
// as long as a queued run needs it.
// Thread safety: a node belongs to one thread.
#include <atomic>
#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "host/core/ScriptVal.h"
#include "host/krom/DeviceContext.h"
#include "host/krom/KROMDialect.h"

namespace Orvane {

class Image;
class KROMBuffer;
class KernelProvider;
class Request;

/// The kernel option that names a kernel of the common library.
constexpr const char *KROMCommonKernelOption = "KROM_RT_UseOrvaneCommonKernel";

class ORVANE_API KROMComputeNode {
public:
    /// `source` may be null for a common kernel. With `compileNow`, the
    /// kernel compiles here, so that IsValid reports compile errors at once.
    static std::unique_ptr<KROMComputeNode> Create(IDeviceContext *ctx, const char *name, const char *source,
                                                   const char *paramStructText, bool compileNow);

    void AddInput(const char *name, const KROMBuffer *buf);
    void AddOutput(const char *name, const KROMBuffer *buf);
    void AddSampler(const char *name, TextureFilterMode filter, TextureAddressMode address,
                    TextureNormalizedCoords coords);
    void SetParamStruct(std::shared_ptr<const void> block, size_t size);
    template <class T> void SetParam(const char *name, T value) {
        static_assert(std::is_arithmetic_v<T>, "kernel scalars are numbers");
        std::vector<uint8_t> bytes(sizeof(T));
        std::memcpy(bytes.data(), &value, sizeof(T));
        scalars_[name] = std::move(bytes);
    }
    /// A list of floats (a provider kernel's argument, such as stroke points).
    void SetParam(const char *name, std::vector<float> values) { floatLists_[name] = std::move(values); }
    /// The flag a provider kernel watches to stop early.
    void SetAbortFlag(const std::atomic<bool> *abort) { abort_ = abort; }
    void AddKernelOption(const char *name, const ScriptVal &value);

    bool IsValid() const { return (context_ != nullptr || provider_ != nullptr) && error_.empty(); }
    /// Compiles (once per context) and runs the kernel over the first
    /// output's size; false with Error() set when anything fails.
    bool RunSession();
    const std::string &Error() const { return error_; }

    /// The short form; `images` are (name, image) pairs, "output" naming the
    /// image to make; further names beginning with "output" name further
    /// images the kernel writes (the first output sets the launch's size and
    /// dstCompOrder, the first input srcCompOrder). An image may be read and
    /// made in one run: the output is new device memory. Offsets below 0 are
    /// not filled. False when there is no
    /// device for the request or the run failed (the reason goes to the
    /// task's device log).
    static bool ExecKernelI(Request *req, const char *name, const char *source, const char *paramStructText,
                            size_t blockSize, int srcCompOrderOffset, int dstCompOrderOffset,
                            std::shared_ptr<void> block, const std::vector<std::pair<const char *, Image *>> &images);

private:
    KROMComputeNode() = default;
    bool ResolveSource();

    IDeviceContext *context_ = nullptr;
    std::string name_, source_, paramText_, error_;
    bool common_ = false;
    std::shared_ptr<const void> block_;
    size_t blockSize_ = 0;
    std::map<std::string, const KROMBuffer *> images_;
    std::vector<std::string> outputs_;
    std::map<std::string, DeviceSampler> samplers_;
    std::map<std::string, std::vector<uint8_t>> scalars_;
    std::map<std::string, std::vector<float>> floatLists_;
    std::shared_ptr<KernelProvider> provider_;
    const std::atomic<bool> *abort_ = nullptr;
    bool RunProvider();
};

} // namespace Orvane
