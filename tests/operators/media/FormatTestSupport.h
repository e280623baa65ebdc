#pragma once
// Helpers of the still image format tests: saving and loading through a format (and a tool's options), test images,
// comparisons, damage, little-endian fields, and running other programs.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cmath>
#include <cstring>
#include <fstream>
#include <functional>

#include "host/core/Registry.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormat.h"
#include "tests/support/TestSupport.h"

namespace Orvane::FmtTest {

using Bytes = std::vector<uint8_t>;
using Options = std::vector<std::pair<const char *, double>>;
using Choices = std::vector<std::pair<const char *, const char *>>;
using Orvane::Test::TempDir;

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

/// Saves `img` with a fresh format at its defaults, no tool involved.
inline Bytes Save(const char *id, Image *img) {
    Ref<ImageFormat> f = MakeFormat(id);
    MemoryIO io;
    f->SetupSave(nullptr, nullptr);
    EXPECT_TRUE(f->SaveHeader(&io, img) && f->SaveFrame(0, img)) << id << " save: " << f->Error();
    return io.Data();
}

/// Saves to `io` through a writing tool given `options`; false with the reason in `error` on failure. `predicted`:
/// where the format's size prediction after SetupSave goes.
inline bool SaveTo(IOClass *io, const char *id, Image *img, const Options &options, std::string &error,
                   const std::atomic<bool> *abort = nullptr, int64_t *predicted = nullptr) {
    OrvaneDoc doc;
    Operator *tool = Orvane::Test::AddImageSource(doc, "Saver", Ref<Image>(img));
    Ref<ImageFormat> f = MakeFormat(id);
    f->AddSaveInputs(tool);
    Request req(tool, nullptr, 0.0, 0, nullptr);
    for (const auto &[name, value] : options) {
        Input *in = tool->FindInput(name);
        EXPECT_NE(in, nullptr) << name;
        if (in) req.SetInputData(in, MakeRef<Number>(value).Get());
    }
    f->SetupSave(tool, &req);
    if (predicted) *predicted = f->PredictFileSize(img);
    f->abortFlag = abort;
    const bool ok = f->SaveHeader(io, img) && f->SaveFrame(0, img);
    f->CleanupSave(tool);
    error = f->Error();
    return ok;
}

/// SaveTo memory: the file (empty, and a test failure, when it fails).
inline Bytes SaveWith(const char *id, Image *img, const Options &options, int64_t *predicted = nullptr) {
    MemoryIO io;
    std::string error;
    EXPECT_TRUE(SaveTo(&io, id, img, options, error, nullptr, predicted)) << id << " save: " << error;
    return io.Data();
}

struct LoadResult {
    Ref<Image> image;
    std::string error;
    bool headerOk = false;
};

/// Reads one frame of `data`; `prepare` readies the format first. A failure must say why.
template <class Prepare> LoadResult Load(const char *id, const Bytes &data, const TagList &tags, Prepare prepare) {
    LoadResult r;
    Ref<ImageFormat> f = MakeFormat(id);
    prepare(*f);
    MemoryIO io(data);
    r.headerOk = f->LoadHeader(&io);
    if (r.headerOk && f->LoadFrameTagList(0, r.image, tags)) return r;
    r.image = nullptr;
    r.error = f->Error();
    EXPECT_FALSE(r.error.empty()) << id << ": a failure says why";
    return r;
}
inline LoadResult Load(const char *id, const Bytes &data, const TagList &tags = {}) {
    return Load(id, data, tags, [](ImageFormat &) {});
}

/// Reads one frame at a proxy scale.
inline LoadResult LoadAt(const char *id, const Bytes &data, int proxy) {
    return Load(id, data, {}, [proxy](ImageFormat &f) { f.proxyScale = proxy; });
}

/// Loads through a reading tool given `options` and choices, for stereo eye `eye`; null with `error` on failure.
inline Ref<Image> LoadWith(const char *id, const Bytes &data, const Options &options, const Choices &choices = {},
                           int eye = 0, std::string *error = nullptr) {
    OrvaneDoc doc;
    Operator *tool = Orvane::Test::AddImageSource(doc, "Loader", nullptr);
    Ref<ImageFormat> f = MakeFormat(id);
    f->AddLoadInputs(tool);
    Request req(tool, nullptr, 0.0, 0, nullptr);
    for (const auto &[name, value] : options) req.SetInputData(tool->FindInput(name), MakeRef<Number>(value).Get());
    for (const auto &[name, v] : choices) req.SetInputData(tool->FindInput(name), MakeRef<IDValue>(OvID(v)).Get());
    f->SetupLoad(tool, &req);
    f->SetAttrsTagList({{FormatStereoEye, eye}});
    MemoryIO io(data);
    Ref<Image> img;
    if (!f->LoadHeader(&io) || !f->LoadFrameTagList(0, img, {})) {
        if (error) *error = f->Error();
        return nullptr;
    }
    return img;
}

/// 16-bit view of pixel (x, y) of the data window.
inline Pixel At(const Image &img, int x, int y) {
    Pixel p;
    const uint8_t *src = img.PixelAddress(x, y);
    EXPECT_NE(src, nullptr) << x << "," << y;
    if (src) LoadPixel(img.Depth(), src, 1, &p);
    return p;
}

inline Ref<Image> MakeImage(int w, int h, int depth, const std::function<Pixel(int, int)> &f) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    EXPECT_TRUE(img && img->AllocScanLineData());
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const Pixel p = f(x, y);
            StorePixel(depth, &p, 1, img->PixelAddress(x, y));
        }
    return img;
}

/// 8-bit values hashed from x, y and the channel, with some equal neighbours so that run-length coders see runs.
inline uint8_t Value8(int x, int y, int c, unsigned seed = 1) {
    if ((x / 3 + y) % 4 == 0) x = 0; // runs
    unsigned h = static_cast<unsigned>(x) * 73856093u ^ static_cast<unsigned>(y) * 19349663u ^
                 static_cast<unsigned>(c) * 83492791u ^ seed;
    h ^= h >> 13, h *= 0x5bd1e995u, h ^= h >> 15;
    return static_cast<uint8_t>(h);
}
/// A w x h RGBA image of `depth` holding Value8 in every channel.
inline Ref<Image> Image8(int w, int h, unsigned seed = 1, int depth = DepthRGBAInt8) {
    return MakeImage(w, h, depth, [seed](int x, int y) {
        auto v = [&](int c) { return static_cast<uint16_t>(Value8(x, y, c, seed) * 257); };
        return Pixel{v(0), v(1), v(2), v(3)};
    });
}

/// A smooth picture with some detail (what lossy coders are made for); opaque unless `alpha`.
inline Pixel Smooth(int x, int y, bool alpha = false) {
    const auto v = [](double t) { return uint16_t(std::lround(127.5 + 120 * std::sin(t)) * 257); };
    return {v(x * 0.05 + y * 0.02), v(y * 0.07 - 1.0), v((x + y) * 0.03 + 2.0),
            alpha ? v(x * 0.04 - y * 0.03) : uint16_t(65535)};
}

/// `got` has the window of `want` and its pixels within `tolerance` (0: exactly), opaque unless `alpha`.
inline void ExpectSamePixels(const Image &want, const Image &got, bool alpha = true, float tolerance = 0) {
    ASSERT_EQ(got.DataWindow(), want.DataWindow());
    const ImgRectI w = want.DataWindow();
    int bad = 0;
    for (int y = w.y0; y < w.y1; ++y)
        for (int x = w.x0; x < w.x1; ++x) {
            const FltPixel a = want.GetFlt(x, y), b = got.GetFlt(x, y);
            const float d = std::max({std::fabs(a.R - b.R), std::fabs(a.G - b.G), std::fabs(a.B - b.B),
                                      std::fabs((alpha ? a.A : 1.f) - b.A)});
            if (!(d <= tolerance) && ++bad < 4) ADD_FAILURE() << "pixel " << x << "," << y << " off by " << d;
        }
}

/// Main rows and auxiliary planes of `got` hold the bytes of `want` over `win`.
inline void ExpectSameRows(const Image &want, const Image &got, const ImgRectI &win) {
    ASSERT_EQ(got.Depth(), want.Depth());
    const size_t bpp = static_cast<size_t>(want.BytesPerPixel());
    for (int y = win.y0; y < win.y1; ++y) {
        ASSERT_EQ(std::memcmp(got.PixelAddress(win.x0, y), want.PixelAddress(win.x0, y), win.Width() * bpp), 0)
            << "row " << y;
        for (int k = 0; k < int(AuxChannelKind::Count); ++k) {
            const auto kind = static_cast<AuxChannelKind>(k);
            if (!want.HasAuxChannel(kind)) continue;
            ASSERT_TRUE(got.HasAuxChannel(kind)) << k;
            const float *a = want.AuxRow(kind, y) + (win.x0 - want.DataWindow().x0);
            const float *b = got.AuxRow(kind, y) + (win.x0 - got.DataWindow().x0);
            ASSERT_EQ(std::memcmp(a, b, sizeof(float) * win.Width()), 0) << "auxiliary " << k << " row " << y;
        }
    }
}

/// Regions of a file (all, inside, a corner pixel, reaching out on either side, wholly outside) read as exactly the
/// crop of the full read; outside the window the image is empty.
inline void ExpectRegionsMatchFullRead(const char *id, const Bytes &data) {
    const LoadResult full = Load(id, data);
    ASSERT_TRUE(full.image) << full.error;
    const ImgRectI w = full.image->DataWindow();
    for (const ImgRectI &rect :
         {w, ImgRectI(w.x0 + 3, w.y0 + 2, w.x1 - 5, w.y1 - 3), ImgRectI(w.x1 - 1, w.y1 - 1, w.x1, w.y1),
          ImgRectI(w.x0 - 9, w.y0 - 9, w.x0 + 4, w.y0 + 3), ImgRectI(w.x1 - 6, w.y1 - 2, w.x1 + 30, w.y1 + 30),
          ImgRectI(w.x1 + 5, w.y1 + 5, w.x1 + 9, w.y1 + 9)}) {
        SCOPED_TRACE(::testing::Message()
                     << id << " region " << rect.x0 << "," << rect.y0 << " " << rect.x1 << "," << rect.y1);
        const ImageDomain region(rect);
        const LoadResult part = Load(id, data, {{ClipFrameRegion, &region}});
        ASSERT_TRUE(part.image) << part.error;
        const ImgRectI want = rect & w;
        if (want.IsNull()) {
            EXPECT_TRUE(part.image->DataWindow().IsNull());
            continue;
        }
        ASSERT_EQ(part.image->DataWindow(), want);
        ExpectSameRows(*full.image, *part.image, want);
    }
}

/// Damaged copies of a good file fail with a reason or read to a sane image: cuts (every byte in the first
/// max(`header`, 256), then 64 more; the last `tail` bytes may be missing), each of the first `header` bytes flipped
/// three ways, and 300 scatterings after the header, a third cut short too. `sizeKept`: a damaged read that succeeds
/// has the stored size. Returns how many of the scattered reads failed.
inline int ExpectDamageFailsCleanly(
    const char *id, const Bytes &good, size_t header, bool sizeKept, size_t tail = 0,
    void (*prepare)(ImageFormat &) = [](ImageFormat &) {}) {
    auto Load = [&](const char *format, const Bytes &data) { return FmtTest::Load(format, data, {}, prepare); };
    const LoadResult whole = Load(id, good);
    EXPECT_TRUE(whole.image) << whole.error;
    if (!whole.image) return 0;
    auto sane = [&](const LoadResult &r, bool sameSize) {
        if (!r.image) return false;
        const int w = r.image->Width(), h = r.image->Height();
        EXPECT_TRUE(w > 0 && h > 0 && (!sameSize || (w == whole.image->Width() && h == whole.image->Height())))
            << w << " x " << h;
        return true;
    };
    const size_t dense = std::max<size_t>(header, 256), step = std::max<size_t>(1, good.size() / 64);
    const size_t end = good.size() - tail;
    for (size_t cut = 0; cut < end; cut += cut < dense ? 1 : step)
        EXPECT_FALSE(Load(id, Bytes(good.begin(), good.begin() + long(cut))).image) << id << " cut at " << cut;
    EXPECT_FALSE(Load(id, Bytes(good.begin(), good.begin() + long(end - 1))).image) << id << " cut at " << end - 1;
    for (size_t at = 0; at < std::min(header, good.size()); ++at)
        for (uint8_t mask : {uint8_t(0xff), uint8_t(0x80), uint8_t(0x01)}) {
            Bytes bad = good;
            bad[at] ^= mask;
            sane(Load(id, bad), false);
        }
    uint32_t state = 12345;
    auto next = [&state] { return state = state * 1664525u + 1013904223u; };
    const size_t from = std::max<size_t>(header, 2);
    int failed = 0;
    for (int round = 0; round < 300 && from < good.size(); ++round) {
        Bytes bad = good;
        for (int i = 0, hits = 1 + int(next() % 4); i < hits; ++i)
            bad[from + next() % (bad.size() - from)] = uint8_t(next() >> 24);
        if (round % 3 == 0) bad.resize(from + next() % (bad.size() - from));
        failed += !sane(Load(id, bad), sizeKept);
    }
    return failed;
}

/// Little-endian fields of a file.
inline uint32_t U32(const Bytes &b, size_t at) {
    return b[at] | b[at + 1] << 8 | b[at + 2] << 16 | uint32_t(b[at + 3]) << 24;
}
inline void Put32(Bytes &b, size_t at, uint32_t v) {
    for (int i = 0; i < 4; ++i) b[at + i] = uint8_t(v >> (8 * i));
}
inline void Put16(Bytes &b, size_t at, uint32_t v) { b[at] = uint8_t(v), b[at + 1] = uint8_t(v >> 8); }

/// A memory stream that takes only the first `limit` bytes written: a full disk.
struct LimitedIO : MemoryIO {
    explicit LimitedIO(int64_t limit) : limit(limit) {}
    int64_t Write(const void *buffer, int64_t bytes) override {
        const int64_t room = std::max<int64_t>(0, std::min(bytes, limit - Tell()));
        return room > 0 ? MemoryIO::Write(buffer, room) : 0;
    }
    const int64_t limit;
};

inline bool RunShell(const std::string &cmd) { return std::system((cmd + " 2>/dev/null").c_str()) == 0; }
inline bool HaveProgram(const char *name) { return RunShell(std::string("command -v ") + name + " >/dev/null"); }

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
    return {out.begin(), out.end()};
}

inline Bytes ReadFile(const std::string &path) {
    std::ifstream f(path, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(f), {});
}
inline void WriteFile(const std::string &path, const Bytes &data) {
    std::ofstream f(path, std::ios::binary);
    f.write(reinterpret_cast<const char *>(data.data()), static_cast<std::streamsize>(data.size()));
}

/// Pixels of `img` that differ from 8-bit RGBA samples stored top row first (alpha only when `alpha`); -1 when the
/// sizes differ.
inline int Mismatches(const Image &img, const Bytes &rgba, int w, int h, bool alpha = true) {
    if (img.Width() != w || img.Height() != h || rgba.size() != size_t(w) * h * 4) return -1;
    int bad = 0;
    for (int row = 0; row < h; ++row)
        for (int x = 0; x < w; ++x) {
            const Pixel p = At(img, x, h - 1 - row);
            const uint8_t *q = &rgba[(size_t(row) * w + x) * 4];
            bad += p.R != q[0] * 257 || p.G != q[1] * 257 || p.B != q[2] * 257 || (alpha && p.A != q[3] * 257);
        }
    return bad;
}

} // namespace Orvane::FmtTest
