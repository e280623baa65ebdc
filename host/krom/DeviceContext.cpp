#include "host/krom/DeviceContext.h"

#include <atomic>
#include <cctype>
#include <condition_variable>
#include <deque>
#include <map>
#include <mutex>
#include <thread>

#include "host/krom/KROMDialect.h"

namespace Orvane {

// Each back end's opener; defined in its own file, or below when not built.
std::unique_ptr<IDeviceContext> OpenOpenCLContext(std::string *error);
std::unique_ptr<IDeviceContext> OpenCUDAContext(std::string *error);

const char *BackendName(DeviceBackend backend) { return backend == DeviceBackend::CUDA ? "CUDA" : "OpenCL"; }

bool ParseDeviceChoice(const std::string &text, DeviceChoice &choice) {
    static const std::pair<const char *, DeviceChoice> kNames[] = {{"cpu", DeviceChoice::CPU},
                                                                   {"auto", DeviceChoice::Auto},
                                                                   {"opencl", DeviceChoice::OpenCL},
                                                                   {"cuda", DeviceChoice::CUDA}};
    for (const auto &[name, value] : kNames)
        if (text == name) {
            choice = value;
            return true;
        }
    return false;
}

const char *DeviceChoiceName(DeviceChoice choice) {
    switch (choice) {
    case DeviceChoice::CPU: return "cpu";
    case DeviceChoice::Auto: return "auto";
    case DeviceChoice::OpenCL: return "opencl";
    case DeviceChoice::CUDA: return "cuda";
    }
    return "cpu";
}

IDeviceMemory::~IDeviceMemory() = default;
IDeviceKernel::~IDeviceKernel() = default;

// ---- kernel signatures ----

namespace {

std::string Trim(const std::string &s) {
    size_t a = 0, b = s.size();
    while (a < b && std::isspace(static_cast<unsigned char>(s[a]))) ++a;
    while (b > a && std::isspace(static_cast<unsigned char>(s[b - 1]))) --b;
    return s.substr(a, b - a);
}

bool IsIdentChar(char c) { return std::isalnum(static_cast<unsigned char>(c)) || c == '_'; }

/// The last identifier of a declaration, and what stands before it.
bool SplitDeclaration(const std::string &decl, std::string &type, std::string &name) {
    size_t end = decl.size();
    while (end > 0 && !IsIdentChar(decl[end - 1])) --end;
    size_t begin = end;
    while (begin > 0 && IsIdentChar(decl[begin - 1])) --begin;
    if (begin == end) return false;
    name = decl.substr(begin, end - begin);
    type = Trim(decl.substr(0, begin));
    return !type.empty();
}

} // namespace

bool ParseKernelSignature(const std::string &source, const std::string &name, std::vector<KernelParamDecl> &params,
                          std::string *error) {
    auto fail = [error](std::string why) {
        if (error) *error = std::move(why);
        return false;
    };
    // Find "__KERNEL__ void name (" with any spacing.
    size_t at = 0, open = std::string::npos;
    while ((at = source.find("__KERNEL__", at)) != std::string::npos) {
        size_t p = at + 10;
        auto skipSpace = [&] {
            while (p < source.size() && std::isspace(static_cast<unsigned char>(source[p]))) ++p;
        };
        skipSpace();
        if (source.compare(p, 4, "void") == 0) {
            p += 4;
            skipSpace();
            if (source.compare(p, name.size(), name) == 0 &&
                (p + name.size() >= source.size() || !IsIdentChar(source[p + name.size()]))) {
                p += name.size();
                skipSpace();
                if (p < source.size() && source[p] == '(') {
                    open = p;
                    break;
                }
            }
        }
        at += 10;
    }
    if (open == std::string::npos) return fail("kernel \"" + name + "\" not found in its text");
    const size_t close = source.find(')', open);
    if (close == std::string::npos) return fail("kernel \"" + name + "\": unclosed parameter list");
    params.clear();
    const std::string list = source.substr(open + 1, close - open - 1);
    size_t start = 0;
    while (start <= list.size()) {
        size_t comma = list.find(',', start);
        if (comma == std::string::npos) comma = list.size();
        const std::string decl = Trim(list.substr(start, comma - start));
        start = comma + 1;
        if (decl.empty()) {
            if (comma == list.size() && params.empty()) break;
            return fail("kernel \"" + name + "\": empty parameter");
        }
        KernelParamDecl p;
        if (!SplitDeclaration(decl, p.type, p.name))
            return fail("kernel \"" + name + "\": cannot read \"" + decl + "\"");
        if (p.type.find("__CONSTANTREF__") != std::string::npos)
            p.kind = KernelParamDecl::Kind::Block;
        else if (p.type.find("__TEXTURE2D_WRITE__") != std::string::npos)
            p.kind = KernelParamDecl::Kind::WriteImage;
        else if (p.type.find("__TEXTURE2D__") != std::string::npos)
            p.kind = KernelParamDecl::Kind::Image;
        else if (p.type.find("__SAMPLER__") != std::string::npos)
            p.kind = KernelParamDecl::Kind::Sampler;
        else
            p.kind = KernelParamDecl::Kind::Scalar;
        params.push_back(std::move(p));
    }
    return true;
}

// ---- the context's shared state: kernels and the device thread ----

struct IDeviceContext::State {
    std::atomic<int> launches{0};
    std::mutex kernelsLock;
    std::map<std::pair<std::string, std::string>, std::shared_ptr<IDeviceKernel>> kernels;
    int compiles = 0;

    std::mutex queueLock;
    std::condition_variable wake, idle;
    std::deque<std::function<void()>> queue;
    bool running = false, stopping = false;
    std::thread thread;
    std::thread::id threadId;
};

IDeviceContext::IDeviceContext() : state_(std::make_unique<State>()) {}

IDeviceContext::~IDeviceContext() {
    State &s = *state_;
    {
        std::lock_guard<std::mutex> lock(s.queueLock);
        s.stopping = true;
    }
    s.wake.notify_all();
    if (s.thread.joinable()) s.thread.join();
}

std::string IDeviceContext::Description() const { return std::string(BackendName(Backend())) + ": " + DeviceName(); }

std::shared_ptr<IDeviceKernel> IDeviceContext::GetKernel(const std::string &name, const std::string &source,
                                                         std::string *log) {
    State &s = *state_;
    std::lock_guard<std::mutex> lock(s.kernelsLock);
    auto key = std::make_pair(name, source);
    if (auto it = s.kernels.find(key); it != s.kernels.end()) return it->second;
    std::vector<KernelParamDecl> params;
    if (!ParseKernelSignature(source, name, params, log)) return nullptr;
    ++s.compiles;
    std::shared_ptr<IDeviceKernel> kernel = Build(name, DialectHeader(Backend()) + source, std::move(params), log);
    if (kernel) s.kernels.emplace(std::move(key), kernel);
    return kernel;
}

int IDeviceContext::CompileCount() const {
    std::lock_guard<std::mutex> lock(state_->kernelsLock);
    return state_->compiles;
}

bool IDeviceContext::Launch(const IDeviceKernel &kernel, const std::vector<KernelArgument> &args, int width, int height,
                            std::string *error) {
    ++state_->launches;
    return DoLaunch(kernel, args, width, height, error);
}

int IDeviceContext::LaunchCount() const { return state_->launches.load(); }

void IDeviceContext::QueueExecute(std::function<void()> fn) {
    State &s = *state_;
    std::lock_guard<std::mutex> lock(s.queueLock);
    if (!s.thread.joinable()) {
        s.thread = std::thread([&s] {
            std::unique_lock<std::mutex> lk(s.queueLock);
            s.threadId = std::this_thread::get_id();
            for (;;) {
                s.wake.wait(lk, [&s] { return s.stopping || !s.queue.empty(); });
                if (s.queue.empty()) return; // stopping, nothing left
                std::function<void()> job = std::move(s.queue.front());
                s.queue.pop_front();
                s.running = true;
                lk.unlock();
                job();
                lk.lock();
                s.running = false;
                if (s.queue.empty()) s.idle.notify_all();
            }
        });
    }
    s.queue.push_back(std::move(fn));
    s.wake.notify_one();
}

bool IDeviceContext::Execute(const std::function<bool()> &fn) {
    State &s = *state_;
    bool onDeviceThread;
    {
        std::lock_guard<std::mutex> lock(s.queueLock);
        onDeviceThread = s.thread.joinable() && s.threadId == std::this_thread::get_id();
    }
    if (onDeviceThread) return fn(); // waiting on ourselves would never end
    std::mutex doneLock;
    std::condition_variable doneCv;
    bool done = false, result = false;
    QueueExecute([&] {
        const bool r = fn();
        std::lock_guard<std::mutex> lock(doneLock);
        result = r;
        done = true;
        doneCv.notify_one();
    });
    std::unique_lock<std::mutex> lock(doneLock);
    doneCv.wait(lock, [&] { return done; });
    return result;
}

void IDeviceContext::Finish() {
    State &s = *state_;
    std::unique_lock<std::mutex> lock(s.queueLock);
    if (s.thread.joinable() && s.threadId == std::this_thread::get_id()) return;
    s.idle.wait(lock, [&s] { return s.queue.empty() && !s.running; });
}

std::unique_ptr<IDeviceContext> OpenDeviceContext(DeviceBackend backend, std::string *error) {
    return backend == DeviceBackend::CUDA ? OpenCUDAContext(error) : OpenOpenCLContext(error);
}

#ifndef ORVANE_HAVE_OPENCL
std::unique_ptr<IDeviceContext> OpenOpenCLContext(std::string *error) {
    if (error) *error = "OpenCL is not part of this build";
    return nullptr;
}
#endif
#ifndef ORVANE_HAVE_CUDA
std::unique_ptr<IDeviceContext> OpenCUDAContext(std::string *error) {
    if (error) *error = "CUDA is not part of this build (no CUDA toolkit was found when it was built)";
    return nullptr;
}
bool CompileKernelForCUDA(const std::string &, const std::string &, std::string *log) {
    if (log) *log = "CUDA is not part of this build";
    return false;
}
#endif

bool BackendBuilt(DeviceBackend backend) {
#ifdef ORVANE_HAVE_OPENCL
    if (backend == DeviceBackend::OpenCL) return true;
#endif
#ifdef ORVANE_HAVE_CUDA
    if (backend == DeviceBackend::CUDA) return true;
#endif
    (void)backend;
    return false;
}

} // namespace Orvane
