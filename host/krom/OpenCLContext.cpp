// The OpenCL back end: kernel text compiled by the platform's driver at run
// time (a GPU vendor's driver, or a CPU implementation such as PoCL).
#ifdef ORVANE_HAVE_OPENCL
#define CL_TARGET_OPENCL_VERSION 120
#include <CL/cl.h>

#include <mutex>

#include "host/krom/DeviceContext.h"
#include "host/krom/KernelDiskCache.h"

namespace Orvane {
namespace {

const char kBuildOptions[] = "-cl-std=CL1.2 -cl-fp32-correctly-rounded-divide-sqrt";

std::string ErrorText(const char *what, cl_int code) {
    return std::string("OpenCL: ") + what + " failed (error " + std::to_string(code) + ")";
}

std::string DeviceString(cl_device_id device, cl_device_info what) {
    size_t size = 0;
    if (clGetDeviceInfo(device, what, 0, nullptr, &size) != CL_SUCCESS || size == 0) return {};
    std::string s(size, '\0');
    clGetDeviceInfo(device, what, size, s.data(), nullptr);
    while (!s.empty() && s.back() == '\0') s.pop_back();
    return s;
}

class CLMemory final : public IDeviceMemory {
public:
    CLMemory(IDeviceContext *ctx, size_t size, cl_mem mem) : IDeviceMemory(ctx, size), mem_(mem) {}
    ~CLMemory() override { clReleaseMemObject(mem_); }
    cl_mem Handle() const { return mem_; }

private:
    cl_mem mem_;
};

class CLKernel final : public IDeviceKernel {
public:
    CLKernel(std::string name, std::vector<KernelParamDecl> params, cl_program program, cl_kernel kernel)
        : IDeviceKernel(std::move(name), std::move(params)), program_(program), kernel_(kernel) {}
    ~CLKernel() override {
        clReleaseKernel(kernel_);
        clReleaseProgram(program_);
    }
    cl_kernel Handle() const { return kernel_; }
    /// Arguments of one cl_kernel are set and launched by one caller at a time.
    std::mutex &Lock() const { return lock_; }

private:
    cl_program program_;
    cl_kernel kernel_;
    mutable std::mutex lock_;
};

class OpenCLContext final : public IDeviceContext {
public:
    OpenCLContext(cl_platform_id platform, cl_device_id device, cl_context context, cl_command_queue queue)
        : platform_(platform), device_(device), context_(context), queue_(queue) {
        name_ = DeviceString(device, CL_DEVICE_NAME);
        size_t size = 0;
        clGetPlatformInfo(platform_, CL_PLATFORM_VERSION, 0, nullptr, &size);
        std::string platformVersion(size, '\0');
        if (size) clGetPlatformInfo(platform_, CL_PLATFORM_VERSION, size, platformVersion.data(), nullptr);
        driverKey_ = "opencl|" + platformVersion + "|" + name_ + "|" + DeviceString(device, CL_DRIVER_VERSION);
    }
    ~OpenCLContext() override {
        clReleaseCommandQueue(queue_);
        clReleaseContext(context_);
    }

    DeviceBackend Backend() const override { return DeviceBackend::OpenCL; }
    std::string DeviceName() const override { return name_; }
    std::string DriverKey() const override { return driverKey_; }
    bool IsCPUDevice() const override {
        cl_device_type type = 0;
        clGetDeviceInfo(device_, CL_DEVICE_TYPE, sizeof type, &type, nullptr);
        return (type & CL_DEVICE_TYPE_CPU) != 0;
    }

    std::shared_ptr<IDeviceMemory> Allocate(size_t bytes, std::string *error) override {
        cl_int err = CL_SUCCESS;
        cl_mem mem = clCreateBuffer(context_, CL_MEM_READ_WRITE, bytes ? bytes : 1, nullptr, &err);
        if (!mem) {
            if (error) *error = ErrorText("allocating device memory", err);
            return nullptr;
        }
        return std::make_shared<CLMemory>(this, bytes, mem);
    }

    bool Write(IDeviceMemory &mem, size_t offset, const void *data, size_t bytes, std::string *error) override {
        if (bytes == 0) return true;
        const cl_int err = clEnqueueWriteBuffer(queue_, static_cast<CLMemory &>(mem).Handle(), CL_TRUE, offset, bytes,
                                                data, 0, nullptr, nullptr);
        if (err != CL_SUCCESS && error) *error = ErrorText("upload", err);
        return err == CL_SUCCESS;
    }

    bool Read(const IDeviceMemory &mem, size_t offset, void *data, size_t bytes, std::string *error) override {
        if (bytes == 0) return true;
        const cl_int err = clEnqueueReadBuffer(queue_, static_cast<const CLMemory &>(mem).Handle(), CL_TRUE, offset,
                                               bytes, data, 0, nullptr, nullptr);
        if (err != CL_SUCCESS && error) *error = ErrorText("download", err);
        return err == CL_SUCCESS;
    }

    bool DoLaunch(const IDeviceKernel &kernel, const std::vector<KernelArgument> &args, int width, int height,
                  std::string *error) override {
        const auto &k = static_cast<const CLKernel &>(kernel);
        std::lock_guard<std::mutex> lock(k.Lock());
        for (size_t i = 0; i < args.size(); ++i) {
            cl_int err;
            if (args[i].memory) {
                cl_mem mem = static_cast<const CLMemory *>(args[i].memory)->Handle();
                err = clSetKernelArg(k.Handle(), static_cast<cl_uint>(i), sizeof mem, &mem);
            } else {
                err = clSetKernelArg(k.Handle(), static_cast<cl_uint>(i), args[i].value.size(), args[i].value.data());
            }
            if (err != CL_SUCCESS) {
                if (error) *error = ErrorText(("setting argument \"" + kernel.Params()[i].name + "\"").c_str(), err);
                return false;
            }
        }
        if (width <= 0 || height <= 0) return true;
        const size_t global[2] = {static_cast<size_t>(width), static_cast<size_t>(height)};
        cl_int err = clEnqueueNDRangeKernel(queue_, k.Handle(), 2, nullptr, global, nullptr, 0, nullptr, nullptr);
        if (err == CL_SUCCESS) err = clFinish(queue_);
        if (err != CL_SUCCESS && error) *error = ErrorText(("running kernel " + kernel.Name()).c_str(), err);
        return err == CL_SUCCESS;
    }

protected:
    std::shared_ptr<IDeviceKernel> Build(const std::string &name, const std::string &fullSource,
                                         std::vector<KernelParamDecl> params, std::string *log) override {
        const std::string key = KernelCacheKey(driverKey_, kBuildOptions, fullSource);
        cl_program program = nullptr;
        std::vector<uint8_t> binary;
        if (LoadCachedKernel(key, binary)) {
            const unsigned char *bytes = binary.data();
            const size_t size = binary.size();
            cl_int status = CL_SUCCESS, err = CL_SUCCESS;
            program = clCreateProgramWithBinary(context_, 1, &device_, &size, &bytes, &status, &err);
            if (program && (err != CL_SUCCESS || status != CL_SUCCESS ||
                            clBuildProgram(program, 1, &device_, kBuildOptions, nullptr, nullptr) != CL_SUCCESS)) {
                clReleaseProgram(program);
                program = nullptr; // a stale or foreign entry: compile from the text
            }
        }
        const bool fromText = program == nullptr;
        if (fromText) {
            const char *text = fullSource.c_str();
            const size_t length = fullSource.size();
            cl_int err = CL_SUCCESS;
            program = clCreateProgramWithSource(context_, 1, &text, &length, &err);
            if (!program) {
                if (log) *log = ErrorText("creating a program", err);
                return nullptr;
            }
            if (clBuildProgram(program, 1, &device_, kBuildOptions, nullptr, nullptr) != CL_SUCCESS) {
                if (log) *log = "OpenCL: kernel " + name + " does not compile:\n" + BuildLog(program);
                clReleaseProgram(program);
                return nullptr;
            }
        }
        cl_int err = CL_SUCCESS;
        cl_kernel kernel = clCreateKernel(program, name.c_str(), &err);
        if (!kernel) {
            if (log) *log = ErrorText(("finding kernel " + name).c_str(), err);
            clReleaseProgram(program);
            return nullptr;
        }
        if (fromText) StoreCachedKernel(key, ProgramBinary(program));
        return std::make_shared<CLKernel>(name, std::move(params), program, kernel);
    }

private:
    std::string BuildLog(cl_program program) const {
        size_t size = 0;
        clGetProgramBuildInfo(program, device_, CL_PROGRAM_BUILD_LOG, 0, nullptr, &size);
        std::string text(size, '\0');
        if (size) clGetProgramBuildInfo(program, device_, CL_PROGRAM_BUILD_LOG, size, text.data(), nullptr);
        while (!text.empty() && text.back() == '\0') text.pop_back();
        return text;
    }

    std::vector<uint8_t> ProgramBinary(cl_program program) const {
        size_t size = 0;
        if (clGetProgramInfo(program, CL_PROGRAM_BINARY_SIZES, sizeof size, &size, nullptr) != CL_SUCCESS || !size)
            return {};
        std::vector<uint8_t> binary(size);
        unsigned char *target = binary.data();
        if (clGetProgramInfo(program, CL_PROGRAM_BINARIES, sizeof target, &target, nullptr) != CL_SUCCESS) return {};
        return binary;
    }

    cl_platform_id platform_;
    cl_device_id device_;
    cl_context context_;
    cl_command_queue queue_;
    std::string name_, driverKey_;
};

} // namespace

std::unique_ptr<IDeviceContext> OpenOpenCLContext(std::string *error) {
    cl_uint platformCount = 0;
    if (clGetPlatformIDs(0, nullptr, &platformCount) != CL_SUCCESS || platformCount == 0) {
        if (error) *error = "OpenCL: no platform found (is an OpenCL driver such as pocl-opencl-icd installed?)";
        return nullptr;
    }
    std::vector<cl_platform_id> platforms(platformCount);
    clGetPlatformIDs(platformCount, platforms.data(), nullptr);
    // A GPU of any platform first, else the first device of any kind.
    cl_platform_id platform = nullptr;
    cl_device_id device = nullptr;
    for (cl_device_type type :
         {static_cast<cl_device_type>(CL_DEVICE_TYPE_GPU), static_cast<cl_device_type>(CL_DEVICE_TYPE_ALL)}) {
        for (cl_platform_id p : platforms) {
            cl_device_id d = nullptr;
            cl_uint n = 0;
            if (clGetDeviceIDs(p, type, 1, &d, &n) == CL_SUCCESS && n > 0) {
                platform = p, device = d;
                break;
            }
        }
        if (device) break;
    }
    if (!device) {
        if (error) *error = "OpenCL: no device found";
        return nullptr;
    }
    cl_int err = CL_SUCCESS;
    const cl_context_properties props[] = {CL_CONTEXT_PLATFORM, reinterpret_cast<cl_context_properties>(platform), 0};
    cl_context context = clCreateContext(props, 1, &device, nullptr, nullptr, &err);
    if (!context) {
        if (error) *error = ErrorText("creating a context", err);
        return nullptr;
    }
    cl_command_queue queue = clCreateCommandQueue(context, device, 0, &err);
    if (!queue) {
        clReleaseContext(context);
        if (error) *error = ErrorText("creating a command queue", err);
        return nullptr;
    }
    return std::make_unique<OpenCLContext>(platform, device, context, queue);
}

} // namespace Orvane
#endif // ORVANE_HAVE_OPENCL
