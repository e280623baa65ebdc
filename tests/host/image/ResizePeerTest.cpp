// Our resize against two other programs on the same picture: OpenImageIO's
// oiiotool (--resize with filters lanczos3 and triangle) and vips (resize
// with kernels lanczos3 and linear). The picture is smooth (wavelengths of 41
// pixels and more, and ramps), written as raw floats and turned into a float
// TIFF and a vips file by vips; vips's results come back as raw floats,
// oiiotool's as the values its --dumpdata prints.
// Tests skip when either program is missing.
//
// Tolerances. All three programs sample pixel centres the same way and
// stretch the filter by the shrink factor, so on the same filter they differ
// only by float rounding (and oiiotool's printed nine digits). Measured on
// this picture, over the interior (4 output pixels from the edges, where the
// programs' border rules differ): Lanczos against oiiotool's lanczos3 9.5e-7,
// against vips's lanczos3 1.8e-7; linear against oiiotool's triangle 6e-7,
// against vips's linear 1.2e-7; a 1.4 times stretch with Lanczos against
// oiiotool 1e-6. The limit, 5e-6, is five times the largest; the same
// comparison tells the filters apart (linear against lanczos3 differs by
// more than 1e-4 here), so it would catch a wrong filter or a shifted grid.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <numbers>
#include <string>
#include <vector>

#include <unistd.h>

#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/ResizeFilters.h"

namespace Orvane::resizepeertest {
namespace {
namespace fs = std::filesystem;

constexpr int kW = 240, kH = 160, kOutW = 120, kOutH = 80;
constexpr double kTolerance = 5e-6;

bool Have(const char *program) {
    return std::system((std::string("command -v ") + program + " >/dev/null 2>&1").c_str()) == 0;
}

bool RunCommand(const std::string &command) { return std::system((command + " >/dev/null 2>&1").c_str()) == 0; }

/// The smooth picture, value at pixel (x, y), rows counted from the bottom.
FltPixel Smooth(int x, int y) {
    const double r = 0.5 + 0.3 * std::sin(2 * std::numbers::pi * x / 53.0) * std::cos(2 * std::numbers::pi * y / 41.0);
    return {float(r), float(0.4 + 0.002 * x), float(0.2 + 0.003 * y), 1.f};
}

/// A folder for the files of one test, removed at the end.
struct Folder {
    fs::path path = fs::temp_directory_path() / ("orvane-resize-peer-" + std::to_string(::getpid()));
    Folder() { fs::create_directories(path); }
    ~Folder() {
        std::error_code ec;
        fs::remove_all(path, ec);
    }
    std::string operator/(const char *name) const { return (path / name).string(); }
};

/// Raw RGBA floats, top row first, as an image (rows bottom up); null if unreadable.
Ref<Image> ReadRaw(const std::string &file, int w, int h) {
    std::ifstream in(file, std::ios::binary);
    std::vector<float> data(static_cast<size_t>(w) * h * 4);
    if (!in.read(reinterpret_cast<char *>(data.data()), data.size() * sizeof(float))) return nullptr;
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    for (int y = 0; y < h; ++y)
        std::memcpy(img->ScanLine(y), data.data() + static_cast<size_t>(h - 1 - y) * w * 4, img->RowBytes());
    return img;
}

/// An image file as oiiotool's --dumpdata prints it (RGBA floats, rows from
/// the top), as an image with rows bottom up; null if unreadable.
Ref<Image> ReadDump(const std::string &file, int w, int h) {
    FILE *pipe = ::popen(("oiiotool --dumpdata " + file + " 2>/dev/null").c_str(), "r");
    if (!pipe) return nullptr;
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    char line[512];
    int count = 0;
    while (std::fgets(line, sizeof line, pipe)) {
        int x = 0, y = 0;
        FltPixel p;
        if (std::sscanf(line, " Pixel (%d, %d): %f %f %f %f", &x, &y, &p.R, &p.G, &p.B, &p.A) == 6 && x >= 0 && x < w &&
            y >= 0 && y < h) {
            img->PutFlt(x, h - 1 - y, p);
            ++count;
        }
    }
    ::pclose(pipe);
    return count == w * h ? img : nullptr;
}

/// Largest difference over the interior (`margin` output pixels from each edge).
double MaxDiff(const Image &a, const Image &b, int margin) {
    double worst = 0;
    for (int y = margin; y < a.Height() - margin; ++y)
        for (int x = margin; x < a.Width() - margin; ++x) {
            const FltPixel p = a.GetFlt(x, y), q = b.GetFlt(x, y);
            for (float d : {p.R - q.R, p.G - q.G, p.B - q.B, p.A - q.A}) worst = std::max(worst, double(std::fabs(d)));
        }
    return worst;
}

class ResizePeers : public testing::Test {
protected:
    void SetUp() override {
        if (!Have("oiiotool") || !Have("vips")) GTEST_SKIP() << "oiiotool or vips is not installed";
        src_ = NewImageTagList({{ImgWidth, kW}, {ImgHeight, kH}, {ImgDepth, DepthRGBAFlt32}});
        src_->AllocScanLineData();
        for (int y = 0; y < kH; ++y)
            for (int x = 0; x < kW; ++x) src_->PutFlt(x, y, Smooth(x, y));
        std::ofstream out(folder_ / "in.raw", std::ios::binary);
        for (int y = kH - 1; y >= 0; --y)
            out.write(reinterpret_cast<const char *>(src_->ScanLine(y)), src_->RowBytes());
        out.close();
        ASSERT_TRUE(
            RunCommand("vips rawload " + folder_ / "in.raw" + " " + folder_ / "in.v" + " 240 160 4 --format float"));
        ASSERT_TRUE(RunCommand("vips tiffsave " + folder_ / "in.v" + " " + folder_ / "in.tif"));
    }

    /// The peer's result of `command` writing `file`: vips files through vips
    /// as raw floats, TIFF files through oiiotool's dump.
    Ref<Image> Peer(const std::string &command, const char *file) {
        if (!RunCommand(command)) return nullptr;
        if (fs::path(file).extension() == ".tif") return ReadDump(folder_ / file, kOutW, kOutH);
        if (!RunCommand("vips rawsave " + folder_ / file + " " + folder_ / "back.raw")) return nullptr;
        return ReadRaw(folder_ / "back.raw", kOutW, kOutH);
    }

    Ref<Image> Ours(int filter) {
        Ref<Image> out = NewImageTagList({{ImgWidth, kOutW}, {ImgHeight, kOutH}, {ImgDepth, DepthRGBAFlt32}});
        EXPECT_TRUE(src_->ResizeTagList(out.Get(), {{ResizeFilter, filter}}));
        return out;
    }

    Folder folder_;
    Ref<Image> src_;
};

TEST_F(ResizePeers, LanczosAgreesWithOiiotoolAndVips) {
    Ref<Image> ours = Ours(RszLanczos);
    Ref<Image> oiio =
        Peer("oiiotool " + folder_ / "in.tif" + " --resize:filter=lanczos3 120x80 -o " + folder_ / "o.tif", "o.tif");
    Ref<Image> vips = Peer("vips resize " + folder_ / "in.v" + " " + folder_ / "v.v" + " 0.5 --kernel lanczos3", "v.v");
    ASSERT_TRUE(oiio && vips);
    const double dOiio = MaxDiff(*ours, *oiio, 4), dVips = MaxDiff(*ours, *vips, 4);
    std::printf("lanczos: oiiotool %.3g, vips %.3g\n", dOiio, dVips);
    EXPECT_LT(dOiio, kTolerance);
    EXPECT_LT(dVips, kTolerance);
    // A different filter is far outside the tolerance.
    EXPECT_GT(MaxDiff(*Ours(RszLinear), *vips, 4), 1e-4);
}

TEST_F(ResizePeers, LinearAgreesWithOiiotoolsTriangleAndVipsLinear) {
    Ref<Image> ours = Ours(RszLinear);
    Ref<Image> oiio =
        Peer("oiiotool " + folder_ / "in.tif" + " --resize:filter=triangle 120x80 -o " + folder_ / "o.tif", "o.tif");
    Ref<Image> vips = Peer("vips resize " + folder_ / "in.v" + " " + folder_ / "v.v" + " 0.5 --kernel linear", "v.v");
    ASSERT_TRUE(oiio && vips);
    const double dOiio = MaxDiff(*ours, *oiio, 4), dVips = MaxDiff(*ours, *vips, 4);
    std::printf("linear: oiiotool %.3g, vips %.3g\n", dOiio, dVips);
    EXPECT_LT(dOiio, kTolerance);
    EXPECT_LT(dVips, kTolerance);
}

TEST_F(ResizePeers, StretchingWithLanczosAgreesWithOiiotool) {
    Ref<Image> ours = NewImageTagList({{ImgWidth, 336}, {ImgHeight, 224}, {ImgDepth, DepthRGBAFlt32}});
    ASSERT_TRUE(src_->ResizeTagList(ours.Get(), {{ResizeFilter, RszLanczos}}));
    ASSERT_TRUE(
        RunCommand("oiiotool " + folder_ / "in.tif" + " --resize:filter=lanczos3 336x224 -o " + folder_ / "o.tif"));
    Ref<Image> oiio = ReadDump(folder_ / "o.tif", 336, 224);
    ASSERT_TRUE(oiio);
    const double d = MaxDiff(*ours, *oiio, 4);
    std::printf("lanczos x1.4: oiiotool %.3g\n", d);
    EXPECT_LT(d, kTolerance);
}

} // namespace
} // namespace Orvane::resizepeertest
