#pragma once
// IDeviceContext: one compute device behind one back end (OpenCL or CUDA).
//
// A context allocates device memory, moves bytes to and from it, compiles
// kernel text written in the KROM dialect (KROMDialect.h) and runs kernels
// over a 2D grid. Compiled kernels are kept per context, keyed by their text,
// so each kernel compiles once per process; the back ends also keep their
// binaries on disk between runs (KernelDiskCache.h).
//
// Every context has a device thread: Execute runs a function there and waits
// for its result, QueueExecute queues one without waiting. Tools put their
// whole device run (buffers, node, launch) into one such function, so runs of
// one device never interleave.
//
// Ownership: contexts are made by OpenDeviceContext and owned by the
// application (Application::Device); memory handles are shared pointers that
// free the device memory when the last holder lets go.
//
// Thread safety: all member functions may be called from any thread.
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

enum class DeviceBackend { OpenCL, CUDA };
ORVANE_API const char *BackendName(DeviceBackend backend);

/// What a render asks for: rows only, the best device present, or one back end.
enum class DeviceChoice { CPU, Auto, OpenCL, CUDA };
/// Reads "cpu", "auto", "opencl" or "cuda"; false for anything else.
ORVANE_API bool ParseDeviceChoice(const std::string &text, DeviceChoice &choice);
ORVANE_API const char *DeviceChoiceName(DeviceChoice choice);

class IDeviceContext;

/// A block of device memory.
class ORVANE_API IDeviceMemory {
public:
    virtual ~IDeviceMemory();
    size_t Size() const { return size_; }
    IDeviceContext *Context() const { return context_; }

protected:
    IDeviceMemory(IDeviceContext *context, size_t size) : context_(context), size_(size) {}

private:
    IDeviceContext *context_;
    size_t size_;
};

/// One parameter of a kernel, as its text declares it.
struct KernelParamDecl {
    enum class Kind { Block, Image, WriteImage, Sampler, Scalar };
    Kind kind = Kind::Scalar;
    std::string name;
    std::string type; ///< the scalar's type word ("int", "float", ...)
};

/// Reads the parameter list of `__KERNEL__ void name(...)` from kernel text.
/// False when the kernel is not found or a parameter cannot be read.
ORVANE_API bool ParseKernelSignature(const std::string &source, const std::string &name,
                                     std::vector<KernelParamDecl> &params, std::string *error);

/// A compiled kernel of one context.
class ORVANE_API IDeviceKernel {
public:
    virtual ~IDeviceKernel();
    const std::string &Name() const { return name_; }
    const std::vector<KernelParamDecl> &Params() const { return params_; }

protected:
    IDeviceKernel(std::string name, std::vector<KernelParamDecl> params)
        : name_(std::move(name)), params_(std::move(params)) {}

private:
    std::string name_;
    std::vector<KernelParamDecl> params_;
};

/// One argument of a launch: device memory, or bytes passed by value.
struct KernelArgument {
    const IDeviceMemory *memory = nullptr;
    std::vector<uint8_t> value;
};

class ORVANE_API IDeviceContext {
public:
    virtual ~IDeviceContext();

    virtual DeviceBackend Backend() const = 0;
    /// The device's own name ("pthread-haswell-...", "NVIDIA H200").
    virtual std::string DeviceName() const = 0;
    /// Names the compiler and driver, so that cached binaries of another
    /// driver are never loaded.
    virtual std::string DriverKey() const = 0;
    /// "OpenCL: <device>" or "CUDA: <device>".
    std::string Description() const;
    /// True for a device that is the host's own CPU (an OpenCL CPU driver).
    virtual bool IsCPUDevice() const { return false; }

    /// Device memory of `bytes` (at least one byte is allocated); null with a
    /// reason when the device has no room.
    virtual std::shared_ptr<IDeviceMemory> Allocate(size_t bytes, std::string *error) = 0;
    virtual bool Write(IDeviceMemory &mem, size_t offset, const void *data, size_t bytes, std::string *error) = 0;
    virtual bool Read(const IDeviceMemory &mem, size_t offset, void *data, size_t bytes, std::string *error) = 0;

    /// The kernel `name` of `source` (kernel text without the dialect header,
    /// which the context puts in front), compiled on first use. Null with the
    /// compiler's log when it does not compile.
    std::shared_ptr<IDeviceKernel> GetKernel(const std::string &name, const std::string &source, std::string *log);
    /// Number of compilations this context has run (cache misses), for tests.
    int CompileCount() const;

    /// Runs `kernel` over width x height work items with `args` in the
    /// kernel's parameter order, and waits for it to finish.
    bool Launch(const IDeviceKernel &kernel, const std::vector<KernelArgument> &args, int width, int height,
                std::string *error);
    /// Number of launches so far, for tests.
    int LaunchCount() const;

    /// Runs `fn` on the device thread and gives back its result; called on
    /// the device thread itself, runs `fn` at once.
    bool Execute(const std::function<bool()> &fn);
    /// Queues `fn` on the device thread without waiting.
    void QueueExecute(std::function<void()> fn);
    /// Waits until every queued function has run.
    void Finish();

protected:
    IDeviceContext();
    /// Compiles the full text (dialect header included) and finds `name` in it.
    virtual std::shared_ptr<IDeviceKernel> Build(const std::string &name, const std::string &fullSource,
                                                 std::vector<KernelParamDecl> params, std::string *log) = 0;
    virtual bool DoLaunch(const IDeviceKernel &kernel, const std::vector<KernelArgument> &args, int width, int height,
                          std::string *error) = 0;

private:
    struct State;
    std::unique_ptr<State> state_;
};

/// Opens the device of one back end (the first GPU it offers, else its first
/// device). Null, with the reason, when the back end is not built or finds no
/// device.
ORVANE_API std::unique_ptr<IDeviceContext> OpenDeviceContext(DeviceBackend backend, std::string *error);
/// Whether the back end was compiled into this build.
ORVANE_API bool BackendBuilt(DeviceBackend backend);
/// Compiles kernel text (without the dialect header) with NVRTC for a
/// generic architecture and throws the result away: checks a kernel without
/// a GPU. False with the log when it does not compile or CUDA is not built.
ORVANE_API bool CompileKernelForCUDA(const std::string &name, const std::string &source, std::string *log);

} // namespace Orvane
