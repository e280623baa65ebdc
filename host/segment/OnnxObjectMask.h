#pragma once
// A provider of the object-mask kernel "GetObjectMask" (KernelProvider.h)
// that runs a segmentation network in ONNX format through OpenCV's dnn
// module, for a learned model a studio brings. The classical provider stays
// the default: this one is registered after it, and so serves, only while
// the environment variable ORVANE_MAGIC_MASK_MODEL names a network file that
// loads.
//
// What the network gets and gives (docs/MAGIC_MASK_PROVIDERS.md):
//   input  1 x 6 x h x w float: the frame's red, green and blue (not
//          premultiplied, 0..1), the positive strokes and the negative
//          strokes (1 on lines NetStrokeWidth pixels wide, else 0), and the
//          mask carried from the previous frame (0 when there is none);
//   output 1 x 1 x h x w float: the matte, clamped to 0..1.
// h x w is the frame's data window scaled so that its longer side is at
// most NetLongSide (never enlarged); the matte is scaled back bilinearly.
// "dst" and "cachePropMaskOut" both receive the matte in every channel.
//
// Thread safety: Run may be called from several threads; the network runs
// one call at a time (it is not reentrant).
#include <memory>
#include <mutex>
#include <string>

#include "host/krom/KernelProvider.h"

namespace Orvane {

class ORVANE_API OnnxObjectMaskProvider : public KernelProvider {
public:
    static constexpr int NetLongSide = 512;
    static constexpr int NetStrokeWidth = 3;

    /// Loads the network at `path`; LoadError() says why when it did not.
    explicit OnnxObjectMaskProvider(const std::string &path);
    ~OnnxObjectMaskProvider() override;
    const char *Name() const override { return "onnx"; }
    bool Available() const override { return net_ != nullptr; }
    bool Run(const ProviderCall &call, std::string &error) override;
    const std::string &LoadError() const { return loadError_; }

private:
    struct Net;
    std::unique_ptr<Net> net_;
    std::string loadError_;
    std::mutex runLock_;
};

/// Registers the provider of the network ORVANE_MAGIC_MASK_MODEL names, when it names one; a file that does not
/// load is reported on the standard error stream once and registers nothing.
ORVANE_API void RegisterOnnxObjectMaskProvider();

} // namespace Orvane
