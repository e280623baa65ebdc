#pragma once
// Helpers shared by the still image format tests: making a format from its
// registry row, saving to and loading from memory, test images with known
// 8-bit and 16-bit values, a temporary folder, and running the netpbm and
// ImageMagick programs to make and read files independently.
#include <gtest/gtest.h>

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormat.h"
#include "tests/support/TestSupport.h"

namespace Orvane::FmtTest {

using Bytes = std::vector<uint8_t>;

/// Loads the tool library once for the whole suite.
class FormatSuite : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

inline Ref<ImageFormat> MakeFormat(const char *id) {
    const Registry *row = ClassRegistry->Find(OvID(id), RegFamilyImageFormat);
    EXPECT_NE(row, nullptr) << id;
    Ref<ImageFormat> f = NewImageFormat(row);
    EXPECT_TRUE(f) << id;
    return f;
}

/// Saves `img` with a fresh format object (options at their defaults unless
/// `setup` changes the object first). Empty on failure, with the reason in `error`.
template <class Setup> Bytes Save(const char *id, Image *img, Setup setup, std::string *error = nullptr) {
    Ref<ImageFormat> f = MakeFormat(id);
    if (!f) return {};
    f->SetupSave(nullptr, nullptr);
    setup(*f);
    MemoryIO io;
    if (!f->SaveHeader(&io, img) || !f->SaveFrame(0, img)) {
        if (error) *error = f->Error();
        ADD_FAILURE() << id << " save: " << f->Error();
        return {};
    }
    return io.Data();
}
inline Bytes Save(const char *id, Image *img) {
    return Save(id, img, [](ImageFormat &) {});
}

using Options = std::vector<std::pair<const char *, double>>;

/// Saves through a writing tool: the format adds its inputs to a tool, the
/// options are given to a request for that tool, and SetupSave reads them.
inline Bytes SaveWith(const char *id, Image *img, const Options &options, std::string *error = nullptr) {
    OrvaneDoc doc;
    Operator *tool = Orvane::Test::AddImageSource(doc, "Saver", Ref<Image>(img));
    Ref<ImageFormat> f = MakeFormat(id);
    if (!tool || !f) return {};
    f->AddSaveInputs(tool);
    Request req(tool, nullptr, 0.0, 0, nullptr);
    for (const auto &[name, value] : options) {
        Input *in = tool->FindInput(name);
        EXPECT_NE(in, nullptr) << name;
        if (in) req.SetInputData(in, MakeRef<Number>(value).Get());
    }
    f->SetupSave(tool, &req);
    MemoryIO io;
    const bool ok = f->SaveHeader(&io, img) && f->SaveFrame(0, img);
    f->CleanupSave(tool);
    if (!ok) {
        if (error)
            *error = f->Error();
        else
            ADD_FAILURE() << id << " save: " << f->Error();
        return {};
    }
    return io.Data();
}

struct LoadResult {
    Ref<Image> image;
    std::string error;
    bool headerOk = false;
};

/// Reads one frame of `data`; `prepare` may set the proxy scale, the abort
/// word or attributes before the header is read.
template <class Prepare> LoadResult Load(const char *id, const Bytes &data, const TagList &tags, Prepare prepare) {
    LoadResult r;
    Ref<ImageFormat> f = MakeFormat(id);
    if (!f) return r;
    prepare(*f);
    MemoryIO io(data);
    r.headerOk = f->LoadHeader(&io);
    if (!r.headerOk) {
        r.error = f->Error();
        EXPECT_FALSE(r.error.empty()) << "a failure says why";
        return r;
    }
    Ref<Image> img;
    if (!f->LoadFrameTagList(0, img, tags)) {
        r.error = f->Error();
        EXPECT_FALSE(r.error.empty()) << "a failure says why";
        return r;
    }
    r.image = img;
    return r;
}
inline LoadResult Load(const char *id, const Bytes &data, const TagList &tags = {}) {
    return Load(id, data, tags, [](ImageFormat &) {});
}

/// Reads one frame at a proxy scale, of a region when given.
inline LoadResult LoadAt(const char *id, const Bytes &data, int proxy, const ImgRectI *region = nullptr) {
    ImageDomain domain(region ? *region : ImgRectI());
    TagList tags;
    if (region) tags.Add({ClipFrameRegion, static_cast<const void *>(&domain)});
    return Load(id, data, tags, [proxy](ImageFormat &f) { f.proxyScale = proxy; });
}

/// 16-bit view of pixel (x, y) of the data window.
inline Pixel At(const Image &img, int x, int y) {
    Pixel p;
    const uint8_t *src = img.PixelAddress(x, y);
    EXPECT_NE(src, nullptr) << x << "," << y;
    if (src) LoadPixel(img.Depth(), src, 1, &p);
    return p;
}

inline void Put(Image &img, int x, int y, const Pixel &p) { StorePixel(img.Depth(), &p, 1, img.PixelAddress(x, y)); }

/// A w x h RGBA image of `depth` whose 8-bit values differ from pixel to
/// pixel (a hash of x, y and the channel), with some equal neighbours so
/// that run-length coders see runs too.
inline uint8_t Value8(int x, int y, int c, unsigned seed = 1) {
    if ((x / 3 + y) % 4 == 0) x = 0; // runs
    unsigned h = static_cast<unsigned>(x) * 73856093u ^ static_cast<unsigned>(y) * 19349663u ^
                 static_cast<unsigned>(c) * 83492791u ^ seed;
    h ^= h >> 13, h *= 0x5bd1e995u, h ^= h >> 15;
    return static_cast<uint8_t>(h);
}
inline Ref<Image> Image8(int w, int h, unsigned seed = 1, int depth = DepthRGBAInt8) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    EXPECT_TRUE(img && img->AllocScanLineData());
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            Pixel p;
            p.R = static_cast<uint16_t>(Value8(x, y, 0, seed) * 257);
            p.G = static_cast<uint16_t>(Value8(x, y, 1, seed) * 257);
            p.B = static_cast<uint16_t>(Value8(x, y, 2, seed) * 257);
            p.A = static_cast<uint16_t>(Value8(x, y, 3, seed) * 257);
            Put(*img, x, y, p);
        }
    return img;
}

/// A memory stream that takes only the first `limit` bytes written: a full disk.
class LimitedIO : public MemoryIO {
public:
    explicit LimitedIO(int64_t limit) : limit_(limit) {}
    int64_t Write(const void *buffer, int64_t bytes) override {
        const int64_t room = std::max<int64_t>(0, std::min(bytes, limit_ - Tell()));
        return room > 0 ? MemoryIO::Write(buffer, room) : 0;
    }

private:
    int64_t limit_;
};

// ---- files and programs ----

/// A folder under /tmp removed with its files when the test ends.
struct TempDir {
    std::string path;
    TempDir() {
        char buf[] = "/tmp/orvane-fmt-XXXXXX";
        const char *p = mkdtemp(buf);
        EXPECT_NE(p, nullptr);
        path = p ? p : "/tmp";
    }
    ~TempDir() {
        const std::string cmd = "rm -rf '" + path + "'";
        if (path.rfind("/tmp/orvane-fmt-", 0) == 0) (void)std::system(cmd.c_str());
    }
    std::string operator/(const std::string &name) const { return path + "/" + name; }
};

inline bool HaveProgram(const char *name) {
    const std::string cmd = std::string("command -v ") + name + " >/dev/null 2>&1";
    return std::system(cmd.c_str()) == 0;
}

inline bool RunShell(const std::string &cmd) { return std::system((cmd + " 2>/dev/null").c_str()) == 0; }

/// Standard output of a command (binary).
inline Bytes Capture(const std::string &cmd) {
    Bytes out;
    FILE *p = popen((cmd + " 2>/dev/null").c_str(), "r");
    if (!p) return out;
    uint8_t buf[65536];
    size_t n;
    while ((n = std::fread(buf, 1, sizeof buf, p)) > 0) out.insert(out.end(), buf, buf + n);
    pclose(p);
    return out;
}

/// Standard output of a command as text.
inline std::string CaptureText(const std::string &cmd) {
    const Bytes out = Capture(cmd);
    return std::string(out.begin(), out.end());
}

inline Bytes ReadFile(const std::string &path) {
    std::ifstream f(path, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(f), {});
}
inline void WriteFile(const std::string &path, const Bytes &data) {
    std::ofstream f(path, std::ios::binary);
    f.write(reinterpret_cast<const char *>(data.data()), static_cast<std::streamsize>(data.size()));
}

/// A binary PPM (rows top first) of w x h, pixel (x, row) = rgb(x, row).
template <class Rgb> Bytes MakePPM(int w, int h, Rgb rgb) {
    const std::string head = "P6\n" + std::to_string(w) + " " + std::to_string(h) + "\n255\n";
    Bytes out(head.begin(), head.end());
    for (int row = 0; row < h; ++row)
        for (int x = 0; x < w; ++x) {
            const auto c = rgb(x, row);
            out.insert(out.end(), {c[0], c[1], c[2]});
        }
    return out;
}

/// Pixels of a P6 or P7-free netpbm PPM (maxval 255), rows top first, 3 bytes each.
inline bool ParsePPM(const Bytes &ppm, int &w, int &h, Bytes &rgb) {
    size_t pos = 0;
    auto token = [&]() {
        std::string t;
        while (pos < ppm.size()) {
            const char c = static_cast<char>(ppm[pos]);
            if (c == '#') {
                while (pos < ppm.size() && ppm[pos] != '\n') ++pos;
            } else if (isspace(static_cast<unsigned char>(c))) {
                if (!t.empty()) break;
                ++pos;
            } else {
                t.push_back(c), ++pos;
            }
        }
        return t;
    };
    if (token() != "P6") return false;
    w = std::atoi(token().c_str()), h = std::atoi(token().c_str());
    const int maxval = std::atoi(token().c_str());
    ++pos;
    if (maxval != 255 || w <= 0 || h <= 0 || ppm.size() < pos + size_t(w) * h * 3) return false;
    rgb.assign(ppm.begin() + static_cast<long>(pos), ppm.begin() + static_cast<long>(pos + size_t(w) * h * 3));
    return true;
}

} // namespace Orvane::FmtTest
