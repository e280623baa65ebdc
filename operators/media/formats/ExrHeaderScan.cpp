#include "operators/media/formats/ExrHeaderScan.h"

#include <cstdint>
#include <map>
#include <vector>

#include "host/media/IOClass.h"
#include "operators/media/formats/ByteOrder.h"

namespace Orvane {
namespace exrheaderscan_detail {

constexpr uint8_t kMultiPartFlag = 0x10; // in the second byte of the version field

/// Bytes the library reads for an attribute of a fixed-size type (it goes
/// by the type, not by the size field); -1 for the other types.
int FixedSize(const std::string &type) {
    static const std::map<std::string, int> sizes = {{"box2i", 16},
                                                     {"box2f", 16},
                                                     {"chromaticities", 32},
                                                     {"compression", 1},
                                                     {"deepImageState", 1},
                                                     {"double", 8},
                                                     {"envmap", 1},
                                                     {"float", 4},
                                                     {"int", 4},
                                                     {"keycode", 28},
                                                     {"lineOrder", 1},
                                                     {"m33f", 36},
                                                     {"m33d", 72},
                                                     {"m44f", 64},
                                                     {"m44d", 128},
                                                     {"rational", 8},
                                                     {"tiledesc", 9},
                                                     {"timecode", 8},
                                                     {"v2i", 8},
                                                     {"v2f", 8},
                                                     {"v2d", 16},
                                                     {"v3i", 12},
                                                     {"v3f", 12},
                                                     {"v3d", 24}};
    const auto it = sizes.find(type);
    return it == sizes.end() ? -1 : it->second;
}

/// Reads the headers; `Left` is what the stream holds past the position.
class Scanner {
public:
    Scanner(IOClass *io, int64_t end) : io_(io), end_(end) {}
    int64_t Left() const { return end_ - io_->Tell(); }
    /// A name ended by a zero byte, at most 255 characters.
    bool Text(std::string &out) {
        out.clear();
        for (char c; io_->ReadExact(&c, 1);) {
            if (c == 0) return true;
            if (out.size() == 255) return false;
            out += c;
        }
        return false;
    }
    bool U32(uint32_t &v) {
        uint8_t b[4];
        if (!io_->ReadExact(b, 4)) return false;
        v = LE::Get32(b);
        return true;
    }
    bool Skip(int64_t n) { return n >= 0 && n <= Left() && io_->Seek(n, IOClass::SeekRelative); }

private:
    IOClass *io_;
    int64_t end_;
};

/// What one header says about its table of chunk offsets.
struct PartChunks {
    int64_t dataWidth = 0, dataHeight = 0, tileWidth = 0, tileHeight = 0, chunkCount = -1;
    /// Entries the library's table will have at least: the stated count, or
    /// the tiles of the full-resolution level (scan-line tables stay small).
    int64_t Entries() const {
        if (chunkCount >= 0) return chunkCount;
        if (tileWidth < 1 || tileHeight < 1 || dataWidth < 1 || dataHeight < 1) return 0;
        return ((dataWidth + tileWidth - 1) / tileWidth) * ((dataHeight + tileHeight - 1) / tileHeight);
    }
};

/// Steps over one attribute's value as the library reads it; false, with
/// the reason, when a size it states runs past the stream.
bool SkipValue(Scanner &in, const std::string &name, const std::string &type, uint32_t size, PartChunks &part,
               std::string &why) {
    auto refuse = [&](uint64_t bytes) {
        why = "OpenEXR: attribute " + name + " claims " + std::to_string(bytes) + " bytes, more than the file holds";
        return false;
    };
    uint32_t a = 0, b = 0, c = 0, d = 0;
    if (type == "chlist") { // entries up to an empty name, 16 bytes after each name
        for (std::string channel; in.Text(channel) && !channel.empty();)
            if (!in.Skip(16)) return refuse(16);
        return true;
    }
    if (type == "preview") { // width, height, then 4 bytes a pixel
        if (!in.U32(a) || !in.U32(b)) return true;
        const uint64_t bytes = uint64_t(a) * b * 4;
        return bytes <= uint64_t(in.Left()) && in.Skip(static_cast<int64_t>(bytes)) ? true : refuse(bytes);
    }
    if (type == "stringvector") { // texts, each with its length, up to the size
        for (int64_t read = 0; read < int64_t(size); read += 4 + int64_t(a)) {
            if (!in.U32(a)) return true;
            if (!in.Skip(a)) return refuse(a);
        }
        return true;
    }
    if (type == "box2i" && name == "dataWindow" && in.U32(a) && in.U32(b) && in.U32(c) && in.U32(d)) {
        part.dataWidth = int64_t(int32_t(c)) - int32_t(a) + 1, part.dataHeight = int64_t(int32_t(d)) - int32_t(b) + 1;
        return true;
    }
    if (type == "tiledesc" && name == "tiles" && in.U32(a) && in.U32(b) && in.Skip(1)) {
        part.tileWidth = a, part.tileHeight = b;
        return true;
    }
    if (type == "int" && name == "chunkCount" && in.U32(a)) {
        part.chunkCount = int32_t(a) < 0 ? 0 : int64_t(a);
        return true;
    }
    if (type == "idmanifest" && size < 4) return refuse(4); // the library takes 4 bytes off the size
    const int fixed = FixedSize(type);
    const int64_t bytes = fixed >= 0 ? fixed : type == "floatvector" ? size / 4 * 4 : int64_t(size);
    return in.Skip(bytes) ? true : refuse(static_cast<uint64_t>(bytes));
}

} // namespace exrheaderscan_detail

namespace ehs = exrheaderscan_detail;

bool ExrHeadersFit(IOClass *io, std::string &why) {
    const int64_t start = io->Tell(), size = io->Size();
    if (start < 0 || size < 0) return true;
    ehs::Scanner in(io, size);
    uint8_t head[8];
    bool fits = true;
    if (in.Left() >= 8 && io->ReadExact(head, 8)) {
        const bool multiPart = head[5] & ehs::kMultiPartFlag;
        std::vector<ehs::PartChunks> parts(1);
        std::string name, type;
        uint32_t valueSize = 0;
        int attributes = 0; // of the header being read
        // Headers: attributes up to an empty name; several parts end with an empty header.
        while (fits && in.Text(name)) {
            if (name.empty()) {
                if (!multiPart || attributes == 0) break;
                parts.emplace_back();
                attributes = 0;
                continue;
            }
            if (!in.Text(type) || !in.U32(valueSize)) break;
            ++attributes;
            fits = ehs::SkipValue(in, name, type, valueSize, parts.back(), why);
        }
        int64_t entries = 0;
        for (const ehs::PartChunks &p : parts) entries += p.Entries();
        if (fits && entries > in.Left() / 8) {
            why = "OpenEXR: the headers ask for " + std::to_string(entries) + " chunks, more than the file holds";
            fits = false;
        }
    }
    io->Seek(start, IOClass::SeekAbsolute);
    return fits;
}

} // namespace Orvane
