#include "host/krom/KernelDiskCache.h"

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>

#include <unistd.h>

namespace Orvane {
namespace {

uint64_t Fnv1a(uint64_t h, const std::string &s) {
    for (unsigned char c : s) {
        h ^= c;
        h *= 0x100000001b3ull;
    }
    return h ^ s.size();
}

/// Marks the start of every entry, so that a foreign file is never loaded.
constexpr char kMagic[8] = {'O', 'V', 'K', 'R', 'N', 'L', '0', '1'};

} // namespace

std::string UserCacheFolder(const char *envVar, const char *subfolder) {
    if (const char *dir = std::getenv(envVar)) {
        if (std::string(dir) == "off") return {};
        if (*dir) return dir;
    }
    const std::string tail = std::string("/orvane/") + subfolder;
    if (const char *xdg = std::getenv("XDG_CACHE_HOME"); xdg && *xdg) return xdg + tail;
    if (const char *home = std::getenv("HOME"); home && *home) return home + ("/.cache" + tail);
    return {};
}

std::string KernelCacheFolder() { return UserCacheFolder("ORVANE_KERNEL_CACHE", "kernels"); }

std::string KernelCacheKey(const std::string &driver, const std::string &options, const std::string &text) {
    uint64_t a = 0xcbf29ce484222325ull, b = 0x84222325cbf29ce4ull;
    for (const std::string *part : {&driver, &options, &text}) {
        a = Fnv1a(a, *part);
        b = Fnv1a(b * 31 + 7, *part);
    }
    char name[40];
    std::snprintf(name, sizeof name, "%016llx%016llx", static_cast<unsigned long long>(a),
                  static_cast<unsigned long long>(b));
    return name;
}

bool LoadCachedKernel(const std::string &key, std::vector<uint8_t> &binary) {
    const std::string folder = KernelCacheFolder();
    if (folder.empty()) return false;
    std::ifstream in(folder + "/" + key + ".bin", std::ios::binary);
    if (!in) return false;
    std::vector<uint8_t> data((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    if (data.size() <= sizeof kMagic || !std::equal(kMagic, kMagic + sizeof kMagic, data.begin())) return false;
    binary.assign(data.begin() + sizeof kMagic, data.end());
    return true;
}

void StoreCachedKernel(const std::string &key, const std::vector<uint8_t> &binary) {
    const std::string folder = KernelCacheFolder();
    if (folder.empty() || binary.empty()) return;
    std::error_code ec;
    std::filesystem::create_directories(folder, ec);
    const std::string final = folder + "/" + key + ".bin";
    const std::string temp = final + ".tmp" + std::to_string(::getpid());
    {
        std::ofstream out(temp, std::ios::binary | std::ios::trunc);
        if (!out) return;
        out.write(kMagic, sizeof kMagic);
        out.write(reinterpret_cast<const char *>(binary.data()), static_cast<std::streamsize>(binary.size()));
        if (!out) {
            out.close();
            std::filesystem::remove(temp, ec);
            return;
        }
    }
    std::filesystem::rename(temp, final, ec);
    if (ec) std::filesystem::remove(temp, ec);
}

} // namespace Orvane
