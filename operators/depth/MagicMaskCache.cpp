#include "operators/depth/MagicMaskCache.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <vector>

#include <unistd.h>

#include "host/flow/Parameter.h"
#include "host/image/Image.h"
#include "host/krom/KernelDiskCache.h"

namespace Orvane::MagicMaskCache {
namespace {

namespace fs = std::filesystem;

constexpr char kMagic[8] = {'O', 'V', 'M', 'M', 'A', 'S', 'K', '1'};
constexpr const char *kSuffix = ".mmask";
constexpr uintmax_t kDefaultLimitMiB = 4096;

struct Header {
    char magic[8];
    uint64_t key;
    int32_t frame, x0, y0, x1, y1, width, height, planes;
};
static_assert(sizeof(Header) == 48, "the file's header is 48 bytes");

std::string Hex(uint64_t v) {
    char text[17];
    std::snprintf(text, sizeof text, "%016llx", static_cast<unsigned long long>(v));
    return text;
}

std::string ToolTag(const std::string &tool) { return Hex(HashBytes(tool.data(), tool.size())); }

std::string FilePath(const std::string &folder, const std::string &tool, uint64_t key) {
    return folder + "/" + ToolTag(tool) + "-" + Hex(key) + kSuffix;
}

Header MakeHeader(uint64_t key, int frame, const Image &matte) {
    const ImgRectI dw = matte.DataWindow();
    Header h{};
    std::memcpy(h.magic, kMagic, sizeof kMagic);
    h.key = key, h.frame = frame, h.x0 = dw.x0, h.y0 = dw.y0, h.x1 = dw.x1, h.y1 = dw.y1;
    h.width = matte.Width(), h.height = matte.Height(), h.planes = 2;
    return h;
}

/// The two images have the kinds and the one window a file holds.
bool Fits(const Image &matte, const Image &propMask) {
    return matte.Depth() == DepthRGBAFlt32 && propMask.Depth() == DepthAFlt32 &&
           matte.DataWindow() == propMask.DataWindow() && matte.Row<float>(matte.DataWindow().y0) &&
           propMask.Row<float>(propMask.DataWindow().y0);
}

uintmax_t LimitBytes() {
    uintmax_t mib = kDefaultLimitMiB;
    if (const char *text = std::getenv("ORVANE_MAGIC_MASK_CACHE_LIMIT"); text && *text) {
        char *end = nullptr;
        const unsigned long long v = std::strtoull(text, &end, 10);
        if (end && *end == '\0') mib = v;
    }
    return mib << 20;
}

/// Drops the least recently written files while the folder's files add up to more than the limit; `keep`, the
/// file just written, stays whatever its time stamp says.
void Prune(const std::string &folder, const fs::path &keep) {
    struct Entry {
        fs::path path;
        uintmax_t bytes;
        fs::file_time_type written;
    };
    std::vector<Entry> entries;
    uintmax_t total = 0;
    std::error_code ec;
    for (fs::directory_iterator it(folder, ec), end; !ec && it != end; it.increment(ec)) {
        if (it->path().extension() != kSuffix) continue;
        std::error_code e1, e2;
        const uintmax_t bytes = it->file_size(e1);
        const fs::file_time_type written = it->last_write_time(e2);
        if (e1 || e2) continue;
        entries.push_back({it->path(), bytes, written});
        total += bytes;
    }
    const uintmax_t limit = LimitBytes();
    if (total <= limit) return;
    std::sort(entries.begin(), entries.end(), [](const Entry &a, const Entry &b) { return a.written < b.written; });
    for (const Entry &e : entries) {
        if (total <= limit) break;
        if (e.path != keep && fs::remove(e.path, ec)) total -= e.bytes;
    }
}

} // namespace

std::string Folder() { return UserCacheFolder("ORVANE_MAGIC_MASK_CACHE", "magicmask"); }

uint64_t FrameKey(uint64_t settings, int frame, const Image &src) {
    const ImgRectI dw = src.DataWindow();
    uint64_t h = HashMix(settings, static_cast<uint32_t>(frame));
    for (int v : {dw.x0, dw.y0, dw.x1, dw.y1, src.Width(), src.Height(), src.Depth()})
        h = HashMix(h, static_cast<uint32_t>(v));
    for (int y = dw.y0; y < dw.y1; ++y)
        if (const char *row = src.Row<char>(y)) h = HashMix(h, HashBytes(row, src.RowBytes()));
    return h;
}

bool Store(const std::string &tool, uint64_t key, int frame, const Image &matte, const Image &propMask) {
    const std::string folder = Folder();
    if (folder.empty() || !Fits(matte, propMask)) return false;
    std::error_code ec;
    fs::create_directories(folder, ec);
    // A temporary name of its own for each writer, in this process and in others.
    static std::atomic<unsigned> writes{0};
    const std::string final = FilePath(folder, tool, key),
                      temp = final + ".tmp" + std::to_string(::getpid()) + "-" + std::to_string(writes++);
    const Header header = MakeHeader(key, frame, matte);
    const ImgRectI dw = matte.DataWindow();
    const int w = dw.x1 - dw.x0;
    bool ok = false;
    {
        std::ofstream out(temp, std::ios::binary | std::ios::trunc);
        if (!out) return false;
        out.write(reinterpret_cast<const char *>(&header), sizeof header);
        std::vector<float> row(w);
        for (int y = dw.y0; y < dw.y1 && out; ++y) {
            const float *rgba = matte.Row<float>(y);
            for (int x = 0; x < w; ++x) row[x] = rgba[4 * x + 3];
            out.write(reinterpret_cast<const char *>(row.data()), static_cast<std::streamsize>(w * sizeof(float)));
        }
        for (int y = dw.y0; y < dw.y1 && out; ++y)
            out.write(reinterpret_cast<const char *>(propMask.Row<float>(y)),
                      static_cast<std::streamsize>(w * sizeof(float)));
        out.flush();
        ok = static_cast<bool>(out);
    }
    if (ok) fs::rename(temp, final, ec);
    if (!ok || ec) {
        fs::remove(temp, ec);
        return false;
    }
    Prune(folder, final);
    return true;
}

bool Load(const std::string &tool, uint64_t key, int frame, Image &matte, Image &propMask) {
    const std::string folder = Folder();
    if (folder.empty() || !Fits(matte, propMask)) return false;
    const std::string path = FilePath(folder, tool, key);
    const ImgRectI dw = matte.DataWindow();
    const size_t w = static_cast<size_t>(dw.x1 - dw.x0), h = static_cast<size_t>(dw.y1 - dw.y0);
    std::error_code ec;
    if (fs::file_size(path, ec) != sizeof(Header) + 2 * w * h * sizeof(float) || ec) return false;
    std::ifstream in(path, std::ios::binary);
    Header got{};
    if (!in || !in.read(reinterpret_cast<char *>(&got), sizeof got)) return false;
    const Header want = MakeHeader(key, frame, matte);
    if (std::memcmp(&got, &want, sizeof got) != 0) return false;
    std::vector<float> row(w);
    for (int y = dw.y0; y < dw.y1; ++y) {
        if (!in.read(reinterpret_cast<char *>(row.data()), static_cast<std::streamsize>(w * sizeof(float))))
            return false;
        float *rgba = matte.Row<float>(y);
        for (size_t x = 0; x < w; ++x) { // a matte is 0..1 whatever a damaged file says
            const float a = std::isfinite(row[x]) ? std::clamp(row[x], 0.f, 1.f) : 0.f;
            rgba[4 * x] = rgba[4 * x + 1] = rgba[4 * x + 2] = rgba[4 * x + 3] = a;
        }
    }
    for (int y = dw.y0; y < dw.y1; ++y)
        if (!in.read(reinterpret_cast<char *>(propMask.Row<float>(y)), static_cast<std::streamsize>(w * sizeof(float))))
            return false;
    return true;
}

int Clear(const std::string &tool) {
    const std::string folder = Folder();
    if (folder.empty()) return 0;
    const std::string prefix = ToolTag(tool) + "-";
    int removed = 0;
    std::error_code ec;
    std::vector<fs::path> doomed;
    for (fs::directory_iterator it(folder, ec), end; !ec && it != end; it.increment(ec)) {
        const std::string name = it->path().filename().string();
        if (name.rfind(prefix, 0) == 0 && name.find(kSuffix) != std::string::npos) doomed.push_back(it->path());
    }
    for (const fs::path &p : doomed) removed += fs::remove(p, ec) ? 1 : 0;
    return removed;
}

} // namespace Orvane::MagicMaskCache
