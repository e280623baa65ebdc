#include "host/krom/KernelProvider.h"

#include <algorithm>
#include <mutex>

namespace Orvane {

const char *const OrvaneSemanticSegmentationParamsText =
    "typedef struct { unsigned long compId; unsigned int operatorId; int timeStamp; int refineRange; "
    "int hasCachePropMask; int isBetterMode; int isTracking; int isRefframe; int isKeyframe; int isSrcPreMult; "
    "int isDstPreMult; int algoVer; } OrvaneSemanticSegmentationParams;\n";

namespace {

struct ProviderTable {
    std::mutex lock;
    std::map<std::string, std::vector<std::shared_ptr<KernelProvider>>> providers;
};

ProviderTable &Providers() {
    static ProviderTable registry;
    return registry;
}

} // namespace

void RegisterKernelProvider(const std::string &kernel, std::shared_ptr<KernelProvider> provider) {
    if (!provider) return;
    ProviderTable &r = Providers();
    std::lock_guard<std::mutex> guard(r.lock);
    r.providers[kernel].push_back(std::move(provider));
}

void UnregisterKernelProvider(const std::string &kernel, const KernelProvider *provider) {
    ProviderTable &r = Providers();
    std::lock_guard<std::mutex> guard(r.lock);
    auto it = r.providers.find(kernel);
    if (it == r.providers.end()) return;
    std::erase_if(it->second, [provider](const auto &p) { return p.get() == provider; });
}

std::shared_ptr<KernelProvider> FindKernelProvider(const std::string &kernel) {
    ProviderTable &r = Providers();
    std::lock_guard<std::mutex> guard(r.lock);
    auto it = r.providers.find(kernel);
    if (it == r.providers.end()) return nullptr;
    for (auto p = it->second.rbegin(); p != it->second.rend(); ++p)
        if ((*p)->Available()) return *p;
    return nullptr;
}

void PurgeKROMMagicMaskTrackerCache() {
    std::vector<std::shared_ptr<KernelProvider>> all;
    {
        ProviderTable &r = Providers();
        std::lock_guard<std::mutex> guard(r.lock);
        if (auto it = r.providers.find("GetObjectMask"); it != r.providers.end()) all = it->second;
    }
    for (const auto &p : all) p->Purge();
}

} // namespace Orvane
