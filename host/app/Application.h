#pragma once
// Application: the process-wide host state: application attributes (the
// switches tools select code paths by) and the tool modules loaded into the
// class registry.
//
// Loading a module runs its static initialisers, which enter its classes into
// ClassRegistry; the host then runs each new row's RegInitFunc.
//
// Devices: the compute device of each back end is opened on first use and
// kept for the process, so kernels compile once per run.
//
// Thread safety: attributes are set at start-up and read by renders; modules
// load on the main thread; Device may be called from any thread.
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "host/core/Object.h"
#include "host/krom/DeviceContext.h"

namespace Orvane {

class ORVANE_API Application : public RefObject {
public:
    /// Loads a module by path. On failure returns false and says why.
    bool LoadModule(const std::string &path, std::string &error);
    /// Loads the standard tool library: $ORVANE_OPERATORS if set, else
    /// liborvaneoperators.so beside the host library.
    bool LoadOperators(std::string &error);
    bool OperatorsLoaded() const { return operatorsLoaded_; }
    const std::vector<std::string> &Modules() const { return modules_; }

    /// Hash of the attributes that change results (part of cache keys).
    uint64_t AttrHash() const;

    /// The device for a choice: null for DeviceChoice::CPU, and null with the
    /// reason when the chosen back end has no device. Auto takes a CUDA
    /// device, else an OpenCL GPU, else none (rows are then the fastest
    /// path: an OpenCL device on the CPU is not chosen by Auto).
    IDeviceContext *Device(DeviceChoice choice, std::string *error = nullptr);

private:
    friend ORVANE_API Application *GetApp();
    Application();
    std::vector<std::string> modules_;
    std::vector<void *> handles_;
    bool operatorsLoaded_ = false;
    std::mutex devicesLock_;
    struct OpenedDevice {
        bool tried = false;
        std::unique_ptr<IDeviceContext> context;
        std::string error;
    };
    OpenedDevice devices_[2]; ///< by DeviceBackend
};

/// The application object, made on first use.
ORVANE_API Application *GetApp();

} // namespace Orvane
