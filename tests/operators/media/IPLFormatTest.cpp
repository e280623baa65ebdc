// IPLFormat: four-component JPEG streams holding R, G, B and A. Round trips
// within a stated error, the Quality option as ImageMagick estimates it,
// four-component files made by ImageMagick, the marker check, refusal of
// three-component files, proxy scaling. Regions, damage, the abort word and
// full disks are in EveryFormatTest.cpp.
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace ipl_format_test {

using namespace Orvane::FmtTest;

class IPLFormatTest : public FormatSuite {};

Ref<Image> SmoothRGBA(int w, int h) {
    return MakeImage(w, h, DepthRGBAInt8, [](int x, int y) { return Smooth(x, y, true); });
}

/// Largest difference in 8-bit codes over all four channels.
int MaxError(const Image &a, const Image &b) {
    int worst = 0;
    for (int y = 0; y < a.Height(); ++y)
        for (int x = 0; x < a.Width(); ++x) {
            const Pixel p = At(a, x, y), q = At(b, x, y);
            for (int e :
                 {(p.R >> 8) - (q.R >> 8), (p.G >> 8) - (q.G >> 8), (p.B >> 8) - (q.B >> 8), (p.A >> 8) - (q.A >> 8)})
                worst = std::max(worst, std::abs(e));
        }
    return worst;
}

// All four channels, alpha included, survive within a few codes; the file
// starts with the Adobe marker the check wants and carries the quality asked
// for (ImageMagick's estimate of it).
TEST_F(IPLFormatTest, WriteReadKeepsAlpha) {
    TempDir dir;
    Ref<Image> src = SmoothRGBA(80, 50);
    struct Case {
        double quality;
        int maxError;
        const char *estimate;
    } cases[] = {{-1, 6, "93"}, {100, 2, "100"}, {60, 20, "60"}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.quality);
        const Bytes bytes =
            c.quality < 0 ? Save("IPLFormat", src.Get()) : SaveWith("IPLFormat", src.Get(), {{"Quality", c.quality}});
        ASSERT_GT(bytes.size(), 16u);
        EXPECT_EQ(bytes[3], 0xEE);
        EXPECT_EQ(std::memcmp(&bytes[6], "Adobe", 5), 0);
        LoadResult r = Load("IPLFormat", bytes);
        ASSERT_TRUE(r.image) << r.error;
        ASSERT_EQ(r.image->DataWindow(), src->DataWindow());
        EXPECT_LE(MaxError(*src, *r.image), c.maxError);
        WriteFile(dir / "q.jpg", bytes);
        EXPECT_EQ(CaptureText("identify -format '%Q %w %h %[colorspace]' " + dir / "q.jpg"),
                  std::string(c.estimate) + " 80 50 CMYK");
    }
}

// A four-component file from ImageMagick (Adobe inverted ink values) reads
// with exactly the samples ImageMagick decodes, inverted back; JpegFormat
// refuses the same file, and ours.
TEST_F(IPLFormatTest, ReadsFourComponentFilesFromImageMagick) {
    TempDir dir;
    ASSERT_TRUE(RunShell("convert -size 23x11 gradient:red-blue -colorspace CMYK -quality 90 '" + dir / "c.jpg" + "'"));
    Bytes ink = Capture("convert '" + dir / "c.jpg" + "' -depth 8 cmyk:-");
    for (uint8_t &v : ink) v = uint8_t(255 - v);
    const Bytes bytes = ReadFile(dir / "c.jpg");
    LoadResult r = Load("IPLFormat", bytes);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(Mismatches(*r.image, ink, 23, 11), 0);
    EXPECT_FALSE(Load("JpegFormat", bytes).headerOk);
    EXPECT_FALSE(Load("JpegFormat", Save("IPLFormat", r.image.Get())).headerOk);
}

// Three components under the IPL name are refused, with or without a JFIF
// marker; a stream whose first marker is neither JFIF nor Adobe fails the check.
TEST_F(IPLFormatTest, RefusesOtherStreams) {
    const Bytes rgb = Save("JpegFormat", SmoothRGBA(16, 16).Get());
    ASSERT_EQ(std::memcmp(&rgb[6], "JFIF", 4), 0);
    Ref<ImageFormat> fmt = MakeFormat("IPLFormat");
    MemoryIO a(rgb);
    EXPECT_TRUE(fmt->CheckFormat(&a)); // the markers pass; the component count does not
    LoadResult r = Load("IPLFormat", rgb);
    EXPECT_FALSE(r.headerOk);
    EXPECT_NE(r.error.find("3"), std::string::npos) << r.error;
    // Our four-component file with its APP14 renamed: no longer an IPL start.
    Bytes four = Save("IPLFormat", SmoothRGBA(16, 16).Get());
    four[6] = 'X';
    MemoryIO b(four);
    EXPECT_FALSE(fmt->CheckFormat(&b));
    EXPECT_EQ(b.Tell(), 0); // the check leaves the stream where it was
    EXPECT_FALSE(Load("IPLFormat", four).headerOk);
    // Fewer than 16 bytes.
    EXPECT_FALSE(Load("IPLFormat", Bytes(four.begin(), four.begin() + 15)).headerOk);
}

// Proxy scale 2 halves (rounding up); each scaled pixel is near the mean of
// the 2 x 2 it covers (a smooth picture).
TEST_F(IPLFormatTest, ProxyScale) {
    const Bytes bytes = Save("IPLFormat", SmoothRGBA(45, 31).Get());
    LoadResult half = LoadAt("IPLFormat", bytes, 2), full = Load("IPLFormat", bytes);
    ASSERT_TRUE(half.image && full.image) << half.error;
    EXPECT_EQ(half.image->DataWindow(), ImgRectI(0, 0, 23, 16));
    EXPECT_NEAR(At(*half.image, 10, 7).A >> 8, At(*full.image, 20, 14).A >> 8, 6);
}

} // namespace ipl_format_test
} // namespace Orvane
