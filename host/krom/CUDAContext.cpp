// The CUDA back end: kernel text compiled at run time by NVRTC and run
// through the CUDA driver API. The driver library is opened at run time, so a
// build with the toolkit still starts (and compiles kernels) on a machine
// without an NVIDIA driver.
#ifdef ORVANE_HAVE_CUDA
#include <cuda.h>
#include <dlfcn.h>
#include <nvrtc.h>

#include <mutex>

#include "host/krom/DeviceContext.h"
#include "host/krom/KROMDialect.h"
#include "host/krom/KernelDiskCache.h"

namespace Orvane {
namespace {

// The driver entry points used here, with the ABI versions their names carry.
struct DriverApi {
    CUresult (*cuInit)(unsigned);
    CUresult (*cuDeviceGetCount)(int *);
    CUresult (*cuDeviceGet)(CUdevice *, int);
    CUresult (*cuDeviceGetName)(char *, int, CUdevice);
    CUresult (*cuDeviceGetAttribute)(int *, CUdevice_attribute, CUdevice);
    CUresult (*cuDriverGetVersion)(int *);
    CUresult (*cuDevicePrimaryCtxRetain)(CUcontext *, CUdevice);
    CUresult (*cuDevicePrimaryCtxRelease)(CUdevice);
    CUresult (*cuCtxSetCurrent)(CUcontext);
    CUresult (*cuCtxSynchronize)();
    CUresult (*cuMemAlloc)(CUdeviceptr *, size_t);
    CUresult (*cuMemFree)(CUdeviceptr);
    CUresult (*cuMemcpyHtoD)(CUdeviceptr, const void *, size_t);
    CUresult (*cuMemcpyDtoH)(void *, CUdeviceptr, size_t);
    CUresult (*cuModuleLoadData)(CUmodule *, const void *);
    CUresult (*cuModuleUnload)(CUmodule);
    CUresult (*cuModuleGetFunction)(CUfunction *, CUmodule, const char *);
    CUresult (*cuLaunchKernel)(CUfunction, unsigned, unsigned, unsigned, unsigned, unsigned, unsigned, unsigned,
                               CUstream, void **, void **);
    CUresult (*cuGetErrorString)(CUresult, const char **);

    /// Opens libcuda once per process; null with the reason when absent.
    static const DriverApi *Get(std::string *error) {
        static std::string failure;
        static const DriverApi *api = []() -> const DriverApi * {
            void *lib = dlopen("libcuda.so.1", RTLD_NOW | RTLD_LOCAL);
            if (!lib) {
                failure = "CUDA: no NVIDIA driver (libcuda.so.1 cannot be opened)";
                return nullptr;
            }
            static DriverApi a;
            bool ok = true;
            auto bind = [&](auto &fn, const char *name) {
                fn = reinterpret_cast<std::remove_reference_t<decltype(fn)>>(dlsym(lib, name));
                ok = ok && fn != nullptr;
            };
            bind(a.cuInit, "cuInit");
            bind(a.cuDeviceGetCount, "cuDeviceGetCount");
            bind(a.cuDeviceGet, "cuDeviceGet");
            bind(a.cuDeviceGetName, "cuDeviceGetName");
            bind(a.cuDeviceGetAttribute, "cuDeviceGetAttribute");
            bind(a.cuDriverGetVersion, "cuDriverGetVersion");
            bind(a.cuDevicePrimaryCtxRetain, "cuDevicePrimaryCtxRetain");
            bind(a.cuDevicePrimaryCtxRelease, "cuDevicePrimaryCtxRelease_v2");
            bind(a.cuCtxSetCurrent, "cuCtxSetCurrent");
            bind(a.cuCtxSynchronize, "cuCtxSynchronize");
            bind(a.cuMemAlloc, "cuMemAlloc_v2");
            bind(a.cuMemFree, "cuMemFree_v2");
            bind(a.cuMemcpyHtoD, "cuMemcpyHtoD_v2");
            bind(a.cuMemcpyDtoH, "cuMemcpyDtoH_v2");
            bind(a.cuModuleLoadData, "cuModuleLoadData");
            bind(a.cuModuleUnload, "cuModuleUnload");
            bind(a.cuModuleGetFunction, "cuModuleGetFunction");
            bind(a.cuLaunchKernel, "cuLaunchKernel");
            bind(a.cuGetErrorString, "cuGetErrorString");
            if (!ok) {
                failure = "CUDA: the driver library lacks an entry point this program needs";
                return nullptr;
            }
            return &a;
        }();
        if (!api && error) *error = failure;
        return api;
    }

    std::string Error(const char *what, CUresult r) const {
        const char *text = nullptr;
        cuGetErrorString(r, &text);
        return std::string("CUDA: ") + what + " failed (" + (text ? text : std::to_string(r)) + ")";
    }
};

/// Compiles full kernel text with NVRTC for `arch` ("compute_75" gives PTX,
/// "sm_90" a CUBIN). Empty with the log on failure.
std::vector<uint8_t> CompileWithNvrtc(const std::string &name, const std::string &text, const std::string &arch,
                                      std::string *log) {
    nvrtcProgram prog = nullptr;
    if (nvrtcCreateProgram(&prog, text.c_str(), (name + ".cu").c_str(), 0, nullptr, nullptr) != NVRTC_SUCCESS) {
        if (log) *log = "NVRTC: cannot create a program for " + name;
        return {};
    }
    const std::string archOption = "--gpu-architecture=" + arch;
    const char *options[] = {archOption.c_str(), "--fmad=false", "--std=c++17"};
    const nvrtcResult result = nvrtcCompileProgram(prog, 3, options);
    std::vector<uint8_t> binary;
    if (result != NVRTC_SUCCESS) {
        size_t size = 0;
        nvrtcGetProgramLogSize(prog, &size);
        std::string text(size, '\0');
        if (size) nvrtcGetProgramLog(prog, text.data());
        while (!text.empty() && text.back() == '\0') text.pop_back();
        if (log) *log = "NVRTC: kernel " + name + " does not compile:\n" + text;
    } else if (arch.rfind("sm_", 0) == 0) {
        size_t size = 0;
        nvrtcGetCUBINSize(prog, &size);
        binary.resize(size);
        nvrtcGetCUBIN(prog, reinterpret_cast<char *>(binary.data()));
    } else {
        size_t size = 0;
        nvrtcGetPTXSize(prog, &size);
        binary.resize(size);
        nvrtcGetPTX(prog, reinterpret_cast<char *>(binary.data()));
    }
    nvrtcDestroyProgram(&prog);
    return binary;
}

std::string NvrtcVersion() {
    int major = 0, minor = 0;
    nvrtcVersion(&major, &minor);
    return std::to_string(major) + "." + std::to_string(minor);
}

class CUMemory final : public IDeviceMemory {
public:
    CUMemory(IDeviceContext *ctx, size_t size, const DriverApi *api, CUdeviceptr ptr)
        : IDeviceMemory(ctx, size), api_(api), ptr_(ptr) {}
    ~CUMemory() override { api_->cuMemFree(ptr_); }
    CUdeviceptr Handle() const { return ptr_; }

private:
    const DriverApi *api_;
    CUdeviceptr ptr_;
};

class CUKernel final : public IDeviceKernel {
public:
    CUKernel(std::string name, std::vector<KernelParamDecl> params, const DriverApi *api, CUmodule module,
             CUfunction fn)
        : IDeviceKernel(std::move(name), std::move(params)), api_(api), module_(module), fn_(fn) {}
    ~CUKernel() override { api_->cuModuleUnload(module_); }
    CUfunction Handle() const { return fn_; }

private:
    const DriverApi *api_;
    CUmodule module_;
    CUfunction fn_;
};

class CUDAContext final : public IDeviceContext {
public:
    CUDAContext(const DriverApi *api, CUdevice device, CUcontext context)
        : api_(api), device_(device), context_(context) {
        char name[256] = {};
        api_->cuDeviceGetName(name, sizeof name, device_);
        name_ = name;
        int major = 0, minor = 0, driver = 0;
        api_->cuDeviceGetAttribute(&major, CU_DEVICE_ATTRIBUTE_COMPUTE_CAPABILITY_MAJOR, device_);
        api_->cuDeviceGetAttribute(&minor, CU_DEVICE_ATTRIBUTE_COMPUTE_CAPABILITY_MINOR, device_);
        api_->cuDriverGetVersion(&driver);
        arch_ = "sm_" + std::to_string(major) + std::to_string(minor);
        driverKey_ = "cuda|" + std::to_string(driver) + "|nvrtc " + NvrtcVersion() + "|" + arch_ + "|" + name_;
    }
    ~CUDAContext() override { api_->cuDevicePrimaryCtxRelease(device_); }

    DeviceBackend Backend() const override { return DeviceBackend::CUDA; }
    std::string DeviceName() const override { return name_; }
    std::string DriverKey() const override { return driverKey_; }

    std::shared_ptr<IDeviceMemory> Allocate(size_t bytes, std::string *error) override {
        MakeCurrent();
        CUdeviceptr ptr = 0;
        const CUresult r = api_->cuMemAlloc(&ptr, bytes ? bytes : 1);
        if (r != CUDA_SUCCESS) {
            if (error) *error = api_->Error("allocating device memory", r);
            return nullptr;
        }
        return std::make_shared<CUMemory>(this, bytes, api_, ptr);
    }

    bool Write(IDeviceMemory &mem, size_t offset, const void *data, size_t bytes, std::string *error) override {
        if (bytes == 0) return true;
        MakeCurrent();
        const CUresult r = api_->cuMemcpyHtoD(static_cast<CUMemory &>(mem).Handle() + offset, data, bytes);
        if (r != CUDA_SUCCESS && error) *error = api_->Error("upload", r);
        return r == CUDA_SUCCESS;
    }

    bool Read(const IDeviceMemory &mem, size_t offset, void *data, size_t bytes, std::string *error) override {
        if (bytes == 0) return true;
        MakeCurrent();
        const CUresult r = api_->cuMemcpyDtoH(data, static_cast<const CUMemory &>(mem).Handle() + offset, bytes);
        if (r != CUDA_SUCCESS && error) *error = api_->Error("download", r);
        return r == CUDA_SUCCESS;
    }

    bool DoLaunch(const IDeviceKernel &kernel, const std::vector<KernelArgument> &args, int width, int height,
                  std::string *error) override {
        if (width <= 0 || height <= 0) return true;
        MakeCurrent();
        std::vector<CUdeviceptr> pointers(args.size());
        std::vector<void *> slots(args.size());
        for (size_t i = 0; i < args.size(); ++i) {
            if (args[i].memory) {
                pointers[i] = static_cast<const CUMemory *>(args[i].memory)->Handle();
                slots[i] = &pointers[i];
            } else {
                slots[i] = const_cast<uint8_t *>(args[i].value.data());
            }
        }
        constexpr unsigned kBlock = 16;
        const unsigned gx = (static_cast<unsigned>(width) + kBlock - 1) / kBlock;
        const unsigned gy = (static_cast<unsigned>(height) + kBlock - 1) / kBlock;
        CUresult r = api_->cuLaunchKernel(static_cast<const CUKernel &>(kernel).Handle(), gx, gy, 1, kBlock, kBlock, 1,
                                          0, nullptr, slots.data(), nullptr);
        if (r == CUDA_SUCCESS) r = api_->cuCtxSynchronize();
        if (r != CUDA_SUCCESS && error) *error = api_->Error(("running kernel " + kernel.Name()).c_str(), r);
        return r == CUDA_SUCCESS;
    }

protected:
    std::shared_ptr<IDeviceKernel> Build(const std::string &name, const std::string &fullSource,
                                         std::vector<KernelParamDecl> params, std::string *log) override {
        const std::string key = KernelCacheKey(driverKey_, "--fmad=false", fullSource);
        std::vector<uint8_t> binary;
        const bool cached = LoadCachedKernel(key, binary);
        if (!cached) {
            binary = CompileWithNvrtc(name, fullSource, arch_, log);
            if (binary.empty()) return nullptr;
        }
        MakeCurrent();
        CUmodule module = nullptr;
        CUresult r = api_->cuModuleLoadData(&module, binary.data());
        if (r != CUDA_SUCCESS && cached) { // a stale entry: compile again
            binary = CompileWithNvrtc(name, fullSource, arch_, log);
            if (binary.empty()) return nullptr;
            r = api_->cuModuleLoadData(&module, binary.data());
        }
        if (r != CUDA_SUCCESS) {
            if (log) *log = api_->Error(("loading kernel " + name).c_str(), r);
            return nullptr;
        }
        CUfunction fn = nullptr;
        r = api_->cuModuleGetFunction(&fn, module, name.c_str());
        if (r != CUDA_SUCCESS) {
            api_->cuModuleUnload(module);
            if (log) *log = api_->Error(("finding kernel " + name).c_str(), r);
            return nullptr;
        }
        if (!cached) StoreCachedKernel(key, binary);
        return std::make_shared<CUKernel>(name, std::move(params), api_, module, fn);
    }

private:
    void MakeCurrent() const { api_->cuCtxSetCurrent(context_); }

    const DriverApi *api_;
    CUdevice device_;
    CUcontext context_;
    std::string name_, arch_, driverKey_;
};

} // namespace

std::unique_ptr<IDeviceContext> OpenCUDAContext(std::string *error) {
    const DriverApi *api = DriverApi::Get(error);
    if (!api) return nullptr;
    CUresult r = api->cuInit(0);
    int count = 0;
    if (r == CUDA_SUCCESS) r = api->cuDeviceGetCount(&count);
    if (r != CUDA_SUCCESS || count == 0) {
        if (error) *error = r != CUDA_SUCCESS ? api->Error("starting the driver", r) : "CUDA: no device found";
        return nullptr;
    }
    CUdevice device = 0;
    CUcontext context = nullptr;
    r = api->cuDeviceGet(&device, 0);
    if (r == CUDA_SUCCESS) r = api->cuDevicePrimaryCtxRetain(&context, device);
    if (r != CUDA_SUCCESS) {
        if (error) *error = api->Error("opening the device", r);
        return nullptr;
    }
    return std::make_unique<CUDAContext>(api, device, context);
}

bool CompileKernelForCUDA(const std::string &name, const std::string &source, std::string *log) {
    return !CompileWithNvrtc(name, DialectHeader(DeviceBackend::CUDA) + source, "compute_75", log).empty();
}

} // namespace Orvane
#endif // ORVANE_HAVE_CUDA
