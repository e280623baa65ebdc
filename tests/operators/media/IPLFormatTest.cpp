// IPLFormat: four-component JPEG streams holding R, G, B and A. Round trips
// within a stated error, the Quality option as libjpeg applies it, files of
// four components made by ImageMagick, the 16-byte marker check, refusal of
// three-component files, proxy scaling, regions and damaged files.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <string>
#include <vector>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Parameter.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormat.h"
#include "tests/operators/media/FormatTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace ipltest_detail {

Ref<Image> MakeImage(int w, int h, const std::function<Pixel(int, int)> &f) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAInt8}});
    img->AllocScanLineData();
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const Pixel p = f(x, y);
            StorePixel(DepthRGBAInt8, &p, 1, img->PixelAddress(x, y));
        }
    return img;
}

/// Smooth colour and a smooth alpha ramp, 8-bit values.
Pixel SmoothRGBA(int x, int y) {
    const auto v = [](double t) { return uint16_t(std::lround(127.5 + 120 * std::sin(t)) * 257); };
    return {v(x * 0.05 + y * 0.02), v(y * 0.07 - 1.0), v((x + y) * 0.03 + 2.0), v(x * 0.04 - y * 0.03)};
}

/// Saves with the given Quality (or the defaults, quality < 0).
/// Saves at the default quality, or at `quality` through a writing tool.
std::vector<uint8_t> Save(Image *img, double quality = -1) {
    return quality < 0 ? FmtTest::Save("IPLFormat", img) : FmtTest::SaveWith("IPLFormat", img, {{"Quality", quality}});
}

using FmtTest::At;
using FmtTest::LoadResult;
using FmtTest::ReadFile;
using FmtTest::TempDir;
using FmtTest::WriteFile;

std::string Shell(const std::string &command) { return FmtTest::CaptureText(command); }

LoadResult Load(const char *id, const std::vector<uint8_t> &bytes, int proxy = 1, const ImgRectI *region = nullptr) {
    return FmtTest::LoadAt(id, bytes, proxy, region);
}

/// Largest difference in 8-bit codes over all four channels.
int MaxError(const Image &a, const Image &b) {
    int worst = 0;
    for (int y = 0; y < a.Height(); ++y)
        for (int x = 0; x < a.Width(); ++x) {
            const Pixel p = At(a, x, y), q = At(b, x, y);
            const int d[4] = {(p.R >> 8) - (q.R >> 8), (p.G >> 8) - (q.G >> 8), (p.B >> 8) - (q.B >> 8),
                              (p.A >> 8) - (q.A >> 8)};
            for (int e : d) worst = std::max(worst, std::abs(e));
        }
    return worst;
}

class IPLFormatTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

// All four channels, alpha included, survive within a few codes; the file
// starts with the Adobe marker the check wants and carries the quality asked
// for (ImageMagick's estimate of it).
TEST_F(IPLFormatTest, WriteReadKeepsAlpha) {
    TempDir dir;
    const int w = 80, h = 50;
    Ref<Image> src = MakeImage(w, h, SmoothRGBA);
    struct Case {
        double quality;
        int maxError;
        const char *estimate;
    } cases[] = {{-1, 6, "93"}, {100, 2, "100"}, {60, 20, "60"}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.quality);
        const auto bytes = Save(src.Get(), c.quality);
        ASSERT_GT(bytes.size(), 16u);
        EXPECT_EQ(bytes[3], 0xEE);
        EXPECT_EQ(std::memcmp(&bytes[6], "Adobe", 5), 0);
        LoadResult r = Load("IPLFormat", bytes);
        ASSERT_TRUE(r.image) << r.error;
        ASSERT_EQ(r.image->Width(), w);
        ASSERT_EQ(r.image->Height(), h);
        EXPECT_LE(MaxError(*src, *r.image), c.maxError);
        WriteFile(dir / "q.jpg", bytes);
        EXPECT_EQ(Shell("identify -format '%Q %w %h %[colorspace]' " + dir / "q.jpg"),
                  std::string(c.estimate) + " 80 50 CMYK");
    }
}

// A four-component file from ImageMagick (Adobe inverted ink values) reads
// with exactly the samples ImageMagick decodes, inverted back; JpegFormat
// refuses the same file.
TEST_F(IPLFormatTest, ReadsFourComponentFilesFromImageMagick) {
    TempDir dir;
    Shell("convert -size 23x11 gradient:red-blue " + dir / "in.ppm");
    Shell("convert " + dir / "in.ppm" + " -colorspace CMYK -quality 90 " + dir / "c.jpg");
    Shell("convert " + dir / "c.jpg" + " -depth 8 cmyk:" + dir / "c.raw");
    const auto raw = ReadFile(dir / "c.raw");
    ASSERT_EQ(raw.size(), 23u * 11 * 4);
    const auto bytes = ReadFile(dir / "c.jpg");
    LoadResult r = Load("IPLFormat", bytes);
    ASSERT_TRUE(r.image) << r.error;
    ASSERT_EQ(r.image->Width(), 23);
    ASSERT_EQ(r.image->Height(), 11);
    int bad = 0;
    for (int row = 0; row < 11; ++row)
        for (int x = 0; x < 23; ++x) {
            const Pixel p = At(*r.image, x, 10 - row);
            const uint8_t *q = &raw[(size_t(row) * 23 + x) * 4];
            bad += p.R != (255 - q[0]) * 257 || p.G != (255 - q[1]) * 257 || p.B != (255 - q[2]) * 257 ||
                   p.A != (255 - q[3]) * 257;
        }
    EXPECT_EQ(bad, 0);
    EXPECT_FALSE(Load("JpegFormat", bytes).headerOk);
    EXPECT_FALSE(Load("JpegFormat", Save(r.image.Get())).headerOk);
}

// Three components under the IPL name are refused, with or without a JFIF
// marker; a stream whose first marker is neither JFIF nor Adobe fails the check.
TEST_F(IPLFormatTest, RefusesOtherStreams) {
    TempDir dir;
    Shell("convert -size 16x16 gradient:red-blue " + dir / "in.ppm");
    Shell("cjpeg " + dir / "in.ppm" + " > " + dir / "rgb.jpg");
    const auto rgb = ReadFile(dir / "rgb.jpg");
    ASSERT_GT(rgb.size(), 16u);
    ASSERT_EQ(std::memcmp(&rgb[6], "JFIF", 4), 0);
    Ref<ImageFormat> fmt = FmtTest::MakeFormat("IPLFormat");
    MemoryIO a(rgb);
    EXPECT_TRUE(fmt->CheckFormat(&a)); // the markers pass; the component count does not
    LoadResult r = Load("IPLFormat", rgb);
    EXPECT_FALSE(r.headerOk);
    EXPECT_NE(r.error.find("3"), std::string::npos) << r.error;
    ASSERT_TRUE(Load("JpegFormat", rgb).image);

    // Our four-component file with its APP14 renamed: no longer an IPL start.
    Ref<Image> src = MakeImage(16, 16, SmoothRGBA);
    auto four = Save(src.Get());
    four[6] = 'X';
    MemoryIO b(four);
    EXPECT_FALSE(fmt->CheckFormat(&b));
    EXPECT_EQ(b.Tell(), 0); // the check leaves the stream where it was
    EXPECT_FALSE(Load("IPLFormat", four).headerOk);
    // Fewer than 16 bytes.
    EXPECT_FALSE(Load("IPLFormat", std::vector<uint8_t>(four.begin(), four.begin() + 15)).headerOk);
}

// Proxy scale 2 halves (rounding up); a region equals the crop of the full read.
TEST_F(IPLFormatTest, ProxyScaleAndRegion) {
    Ref<Image> src = MakeImage(45, 31, SmoothRGBA);
    const auto bytes = Save(src.Get());
    LoadResult half = Load("IPLFormat", bytes, 2);
    ASSERT_TRUE(half.image) << half.error;
    EXPECT_EQ(half.image->Width(), 23);
    EXPECT_EQ(half.image->Height(), 16);
    LoadResult full = Load("IPLFormat", bytes);
    ASSERT_TRUE(full.image);
    // Each scaled pixel is near the mean of the 2 x 2 it covers (smooth picture).
    const Pixel p = At(*half.image, 10, 7), q = At(*full.image, 20, 14);
    EXPECT_NEAR(p.A >> 8, q.A >> 8, 6);
    const ImgRectI r(3, 4, 30, 20);
    LoadResult part = Load("IPLFormat", bytes, 1, &r);
    ASSERT_TRUE(part.image) << part.error;
    EXPECT_EQ(part.image->DataWindow(), r);
    int bad = 0;
    for (int y = r.y0; y < r.y1; ++y)
        for (int x = r.x0; x < r.x1; ++x) bad += !(At(*part.image, x, y) == At(*full.image, x, y));
    EXPECT_EQ(bad, 0);
}

// Truncated IPL files fail with a reason.
TEST_F(IPLFormatTest, TruncatedFilesFailCleanly) {
    Ref<Image> src = MakeImage(40, 40, SmoothRGBA);
    const auto bytes = Save(src.Get());
    for (int k = 1; k < 10; ++k) {
        const size_t n = bytes.size() * k / 10;
        LoadResult r = Load("IPLFormat", std::vector<uint8_t>(bytes.begin(), bytes.begin() + n));
        EXPECT_FALSE(r.image) << n;
        EXPECT_FALSE(r.error.empty()) << n;
    }
}

} // namespace ipltest_detail
} // namespace Orvane
