#include "host/app/Application.h"

#include <cstdlib>
#include <dlfcn.h>
#include <filesystem>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/Parameter.h"
#include "host/segment/BuiltinProviders.h"

namespace Orvane {

Application::Application() {
    // Both fast row paths are on by default; tests switch them to compare.
    SetAttrsTagList({{AppFastPower, 1}, {AppVectorRows, 1}});
    // The host's own kernel providers come first, so providers registered later take over while available.
    RegisterBuiltinProviders();
}

Application *GetApp() {
    static Application *app = new Application; // lives for the process, like the registry it feeds
    return app;
}

bool Application::LoadModule(const std::string &path, std::string &error) {
    for (const std::string &m : modules_)
        if (m == path) return true;
    void *handle = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle) {
        const char *why = dlerror();
        error = why ? why : ("cannot load " + path);
        return false;
    }
    handles_.push_back(handle);
    modules_.push_back(path);
    if (ClassRegistry) ClassRegistry->InitAll();
    return true;
}

bool Application::LoadOperators(std::string &error) {
    if (operatorsLoaded_) return true;
    std::string path;
    if (const char *env = std::getenv("ORVANE_OPERATORS"); env && *env) {
        path = env;
    } else {
        Dl_info info{};
        if (dladdr(reinterpret_cast<void *>(&GetApp), &info) && info.dli_fname)
            path = (std::filesystem::path(info.dli_fname).parent_path() / "liborvaneoperators.so").string();
        else
            path = "liborvaneoperators.so";
    }
    operatorsLoaded_ = LoadModule(path, error);
    return operatorsLoaded_;
}

IDeviceContext *Application::Device(DeviceChoice choice, std::string *error) {
    std::lock_guard<std::mutex> lock(devicesLock_);
    auto open = [this](DeviceBackend backend) -> OpenedDevice & {
        OpenedDevice &d = devices_[static_cast<int>(backend)];
        if (!d.tried) {
            d.tried = true;
            d.context = OpenDeviceContext(backend, &d.error);
        }
        return d;
    };
    auto give = [error](OpenedDevice &d) {
        if (!d.context && error) *error = d.error;
        return d.context.get();
    };
    switch (choice) {
    case DeviceChoice::CPU: return nullptr;
    case DeviceChoice::OpenCL: return give(open(DeviceBackend::OpenCL));
    case DeviceChoice::CUDA: return give(open(DeviceBackend::CUDA));
    case DeviceChoice::Auto: break;
    }
    if (OpenedDevice &cuda = open(DeviceBackend::CUDA); cuda.context) return cuda.context.get();
    OpenedDevice &cl = open(DeviceBackend::OpenCL);
    if (cl.context && !cl.context->IsCPUDevice()) return cl.context.get();
    if (error) *error = "no GPU found; the rows run on the CPU";
    return nullptr;
}

uint64_t Application::AttrHash() const {
    uint64_t h = 0x0a99;
    for (const TagItem &item : Attrs().Items()) h = HashMix(HashMix(h, item.tag), item.value);
    return h;
}

} // namespace Orvane
