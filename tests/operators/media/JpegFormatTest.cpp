// JpegFormat, and IPLFormat (four-component streams holding R, G, B and A), against djpeg and ImageMagick.
#include "host/flow/Parameter.h"
#include "host/image/PixelMemory.h"
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace jpeg_format_test {

using namespace Orvane::FmtTest;

class JpegFormatTest : public FormatSuite {};
class IPLFormatTest : public FormatSuite {};

Ref<Image> SmoothImage(int w, int h, bool alpha = false) {
    return MakeImage(w, h, DepthRGBAInt8, [alpha](int x, int y) { return Smooth(x, y, alpha); });
}

/// What djpeg (the same library at its default settings) decodes from a file, as 8-bit RGBA.
Bytes Djpeg(const std::string &path, const std::string &options = "") {
    return Capture("djpeg -pnm " + options + " '" + path + "' | convert pnm:- -depth 8 rgba:-");
}

std::string Identify(const std::string &format, const std::string &path) {
    return CaptureText("identify -format '" + format + "' '" + path + "'");
}

// A smooth picture written and read back: no sample off by more than the row's codes (JPEG: colour, alpha read as
// opaque; IPL: alpha kept too), a PSNR above the row's; the quality as ImageMagick estimates it. IPL files start with
// the Adobe marker its check wants.
TEST_F(JpegFormatTest, WriteReadIsCloseForBothKinds) {
    TempDir dir;
    // Format, options, largest error, smallest PSNR, what identify reports.
    const std::tuple<const char *, Options, int, int, const char *> cases[] = {
        {"JpegFormat", {}, 12, 40, "97 96 64 sRGB"}, // quality 97, no chroma subsampling
        {"JpegFormat", {{"Quality", 90}, {"ChromaSubsampling", 1}}, 24, 34, "90 96 64 sRGB"},
        {"IPLFormat", {}, 6, 0, "93 96 64 CMYK"},
        {"IPLFormat", {{"Quality", 100}}, 2, 0, "100 96 64 CMYK"},
        {"IPLFormat", {{"Quality", 60}}, 20, 0, "60 96 64 CMYK"},
    };
    for (const auto &[id, options, maxError, minPSNR, identify] : cases) {
        SCOPED_TRACE(::testing::Message() << id << " " << identify);
        const bool ipl = std::string(id) == "IPLFormat";
        Ref<Image> src = SmoothImage(96, 64, ipl);
        const Bytes bytes = SaveWith(id, src.Get(), options);
        EXPECT_TRUE(!ipl || (bytes[3] == 0xEE && std::memcmp(&bytes[6], "Adobe", 5) == 0));
        LoadResult r = Load(id, bytes);
        ASSERT_TRUE(r.image) << r.error;
        ASSERT_EQ(r.image->DataWindow(), src->DataWindow());
        double sq = 0;
        int worst = 0;
        for (int y = 0; y < 64; ++y)
            for (int x = 0; x < 96; ++x) {
                const Pixel a = At(*src, x, y), b = At(*r.image, x, y);
                for (int e : {(a.R >> 8) - (b.R >> 8), (a.G >> 8) - (b.G >> 8), (a.B >> 8) - (b.B >> 8)}) {
                    sq += double(e) * e;
                    worst = std::max(worst, std::abs(e));
                }
                worst = std::max(worst, std::abs((a.A >> 8) - (b.A >> 8)));
            }
        EXPECT_GT(10 * std::log10(255.0 * 255.0 / (sq / (3.0 * 96 * 64) + 1e-12)), minPSNR);
        EXPECT_LE(worst, maxError);
        WriteFile(dir / "q.jpg", bytes);
        EXPECT_EQ(Identify("%Q %w %h %[colorspace]", dir / "q.jpg"), identify);
    }
}

// Our files: djpeg decodes what we decode; ImageMagick reads the size, the quality and the sampling asked for, the
// defaults (quality 97, no chroma subsampling, no resolution) and a custom resolution in dots per inch.
TEST_F(JpegFormatTest, OurFilesAsDjpegAndImageMagickReadThem) {
    TempDir dir;
    Ref<Image> src = SmoothImage(77, 45); // not multiples of the block size
    for (const auto &[options, format, expected] :
         {std::tuple{Options{{"Quality", 80}, {"ChromaSubsampling", 1}}, "%w %h %Q %[jpeg:sampling-factor]",
                     "77 45 80 2x2,1x1,1x1"},
          {Options{{"ResolutionDPI", 150}}, "%Q %[jpeg:sampling-factor] %U", "97 1x1,1x1,1x1 Undefined"},
          {Options{{"SetCustomResolution", 1}, {"ResolutionDPI", 150}}, "%x %y %U", "150 150 PixelsPerInch"}}) {
        SCOPED_TRACE(format);
        const std::string path = dir / "ours.jpg";
        WriteFile(path, SaveWith("JpegFormat", src.Get(), options));
        EXPECT_EQ(Identify(format, path), expected);
        LoadResult r = Load("JpegFormat", ReadFile(path));
        ASSERT_TRUE(r.image) << r.error;
        EXPECT_EQ(Mismatches(*r.image, Djpeg(path), 77, 45), 0);
    }
}

// Proxy scale 2 halves the size (rounding up) through libjpeg's scaling, exactly as djpeg -scale 1/2 decodes; 4
// quarters it.
TEST_F(JpegFormatTest, ProxyScaleDecodesAsDjpegScales) {
    TempDir dir;
    Ref<Image> src = SmoothImage(101, 60);
    const Bytes bytes = Save("JpegFormat", src.Get());
    WriteFile(dir / "p.jpg", bytes);
    for (int scale : {2, 4}) {
        SCOPED_TRACE(scale);
        LoadResult r = LoadAt("JpegFormat", bytes, scale);
        ASSERT_TRUE(r.image) << r.error;
        EXPECT_EQ(std::pair(r.image->GetAttrL(ImgFullWidth), r.image->GetAttrL(ImgFullHeight)), std::pair(101LL, 60LL));
        const Bytes ref = Djpeg(dir / "p.jpg", "-scale 1/" + std::to_string(scale));
        EXPECT_EQ(Mismatches(*r.image, ref, (101 + scale - 1) / scale, 60 / scale), 0);
    }
}

// A progressive file keeps all its coefficients while decoding (at least 8 MiB of luma here), whatever the proxy
// scale: under a 4 MiB limit it fails with a clear message where the same picture as one scan reads; with room it
// decodes exactly as djpeg does.
TEST_F(JpegFormatTest, ProgressiveCoefficientsCountAgainstTheMemoryLimit) {
    if (!HaveProgram("jpegtran") || !HaveProgram("djpeg")) GTEST_SKIP() << "jpegtran or djpeg is not installed";
    TempDir dir;
    const Bytes baseline = Save("JpegFormat", SmoothImage(2048, 2048).Get());
    WriteFile(dir / "b.jpg", baseline);
    ASSERT_TRUE(RunShell("jpegtran -progressive '" + (dir / "b.jpg") + "' > '" + (dir / "p.jpg") + "'"));
    const Bytes progressive = ReadFile(dir / "p.jpg");
    {
        struct Restore {
            ~Restore() { SetPixelMemoryLimit(0); }
        } restore;
        SetPixelMemoryLimit(size_t(4) << 20);
        EXPECT_TRUE(LoadAt("JpegFormat", baseline, 4).image);
        const LoadResult r = LoadAt("JpegFormat", progressive, 4);
        EXPECT_FALSE(r.image);
        EXPECT_EQ(r.error, "JPEG: decoding this multi-scan file needs more memory than the memory limit leaves");
    }
    const LoadResult r = LoadAt("JpegFormat", progressive, 4);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(Mismatches(*r.image, Djpeg(dir / "p.jpg", "-scale 1/4"), 512, 512), 0);
}

// A file whose JFIF densities differ reads with the pixel aspect they give.
TEST_F(JpegFormatTest, DensitiesGiveThePixelAspect) {
    TempDir dir;
    Bytes wide = Save("JpegFormat", SmoothImage(16, 8).Get());
    ASSERT_EQ(std::memcmp(&wide[6], "JFIF", 5), 0);
    const uint8_t density[5] = {0, 0, 200, 0, 100}; // 200 x 100, no unit
    std::memcpy(&wide[13], density, 5);
    WriteFile(dir / "wide.jpg", wide);
    EXPECT_EQ(Identify("%x %y", dir / "wide.jpg"), "200 100");
    Ref<ImageFormat> fmt = MakeFormat("JpegFormat");
    MemoryIO io(wide);
    ASSERT_TRUE(fmt->LoadHeader(&io)) << fmt->Error();
    // 200 pixels an inch across, 100 down: a pixel is half as wide as high.
    EXPECT_DOUBLE_EQ(fmt->aspectX / fmt->aspectY, 0.5);
}

/// Inserts an APP2 ICC profile marker after SOI: FF E2, length, "ICC_PROFILE\0", chunk 1 of 1, the profile.
Bytes WithICC(const Bytes &jpeg, const Bytes &icc) {
    const size_t len = 2 + 12 + 2 + icc.size();
    Bytes seg = {0xFF, 0xE2, uint8_t(len >> 8), uint8_t(len)};
    seg.insert(seg.end(), {'I', 'C', 'C', '_', 'P', 'R', 'O', 'F', 'I', 'L', 'E', 0, 1, 1});
    seg.insert(seg.end(), icc.begin(), icc.end());
    Bytes out = jpeg;
    out.insert(out.begin() + 2, seg.begin(), seg.end());
    return out;
}

/// A minimal ICC profile: a v2 "desc" text and, if gamma8 > 0, a one-entry rTRC curve.
Bytes Profile(const std::string &desc, int gamma8) {
    Bytes p(128, 0);
    auto be32 = [&](uint32_t v) {
        for (int s = 24; s >= 0; s -= 8) p.push_back(uint8_t(v >> s));
    };
    const uint32_t tags = gamma8 > 0 ? 2 : 1, descAt = 132 + 12 * tags, descLen = 12 + uint32_t(desc.size()) + 1;
    const uint32_t curveAt = (descAt + descLen + 3) & ~3u;
    be32(tags);
    p.insert(p.end(), {'d', 'e', 's', 'c'}), be32(descAt), be32(descLen);
    if (gamma8 > 0) p.insert(p.end(), {'r', 'T', 'R', 'C'}), be32(curveAt), be32(14);
    p.insert(p.end(), {'d', 'e', 's', 'c', 0, 0, 0, 0}), be32(uint32_t(desc.size()) + 1);
    p.insert(p.end(), desc.c_str(), desc.c_str() + desc.size() + 1);
    p.resize(curveAt, 0);
    if (gamma8 > 0)
        p.insert(p.end(), {'c', 'u', 'r', 'v', 0, 0, 0, 0, 0, 0, 0, 1, uint8_t(gamma8 >> 8), uint8_t(gamma8)});
    for (int i = 0; i < 4; ++i) p[i] = uint8_t(p.size() >> (24 - 8 * i));
    return p;
}

// The words of the profile's description name the colour space; a power tone curve gives the gamma.
TEST_F(JpegFormatTest, ICCProfileFillsMetadata) {
    const Bytes plain = Save("JpegFormat", SmoothImage(8, 8).Get());
    // 563 / 256 = 2.19921875.
    for (auto [desc, gamma8, space] : {std::tuple{"sRGB IEC61966-2.1", 0, "sRGB"},
                                       {"Adobe RGB (1998)", 563, "AdobeRGB"},
                                       {"ProPhoto RGB", 461, "ProPhotoRGB"},
                                       {"My Rec 709 display", 0, "Rec709"},
                                       {"Something else", 563, ""}}) {
        SCOPED_TRACE(desc);
        LoadResult r = Load("JpegFormat", WithICC(plain, Profile(desc, gamma8)));
        ASSERT_TRUE(r.image) << r.error;
        const ScriptVal &md = r.image->Metadata();
        auto text = [&](const char *key) { return md.IsTable() && md.Find(key) ? md.Find(key)->AsText() : ""; };
        EXPECT_EQ(text("ColorSpace"), space);
        EXPECT_EQ(text("ColorSpaceID"), space);
        const ScriptVal *g = md.IsTable() && md.Find("GammaSpace") ? md.Find("GammaSpace")->Find("Gamma") : nullptr;
        if (!*space) continue;
        EXPECT_DOUBLE_EQ(g && g->IsNumber() ? g->AsNumber() : 0.0, gamma8 / 256.0);
    }
}

// The resolution slider shows only while a custom resolution is asked for.
TEST_F(JpegFormatTest, ResolutionSliderFollowsItsCheckbox) {
    OrvaneDoc doc;
    Operator *tool = Orvane::Test::AddImageSource(doc, "saver", nullptr);
    Ref<ImageFormat> fmt = MakeFormat("JpegFormat");
    fmt->AddSaveInputs(tool);
    Input *check = tool->FindInput("SetCustomResolution"), *dpi = tool->FindInput("ResolutionDPI");
    ASSERT_TRUE(check && dpi);
    EXPECT_FALSE(dpi->IsVisible());
    for (double on : {1.0, 0.0}) {
        fmt->NotifyChangedSave(tool, check, MakeRef<Number>(on).Get(), 0.0);
        EXPECT_EQ(dpi->IsVisible(), on > 0) << on;
    }
}

// A frame header (SOF) with zero components or 12-bit precision fails.
TEST_F(JpegFormatTest, BadFrameHeadersFail) {
    const Bytes bytes = Save("JpegFormat", SmoothImage(64, 48).Get());
    const uint8_t sofMarker[] = {0xFF, 0xC0};
    const size_t sof = size_t(std::search(bytes.begin(), bytes.end(), sofMarker, sofMarker + 2) - bytes.begin());
    ASSERT_LT(sof + 9, bytes.size());
    for (auto [at, value] : {std::pair{sof + 9, 0}, {sof + 4, 12}}) {
        Bytes bad = bytes;
        bad[at] = uint8_t(value);
        EXPECT_FALSE(Load("JpegFormat", bad).image) << at - sof << " = " << value;
    }
}

// A four-component file from ImageMagick (Adobe inverted ink values) reads with exactly the samples ImageMagick
// decodes, inverted back; JpegFormat refuses the same file, saying the file is IPL's, and ours.
TEST_F(IPLFormatTest, ReadsFourComponentFilesFromImageMagick) {
    TempDir dir;
    ASSERT_TRUE(RunShell("convert -size 23x11 gradient:red-blue -colorspace CMYK -quality 90 '" + dir / "c.jpg" + "'"));
    ASSERT_EQ(Identify("%[colorspace]", dir / "c.jpg"), "CMYK");
    Bytes ink = Capture("convert '" + dir / "c.jpg" + "' -depth 8 cmyk:-");
    for (uint8_t &v : ink) v = uint8_t(255 - v);
    const Bytes bytes = ReadFile(dir / "c.jpg");
    LoadResult r = Load("IPLFormat", bytes);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(Mismatches(*r.image, ink, 23, 11), 0);
    const LoadResult refused = Load("JpegFormat", bytes);
    EXPECT_FALSE(refused.headerOk);
    EXPECT_NE(refused.error.find("IPL"), std::string::npos) << refused.error;
    EXPECT_FALSE(Load("JpegFormat", Save("IPLFormat", r.image.Get())).headerOk);
}

// Three components under the IPL name are refused, with or without a JFIF marker; a stream whose first marker is
// neither JFIF nor Adobe fails the check.
TEST_F(IPLFormatTest, RefusesOtherStreams) {
    const Bytes rgb = Save("JpegFormat", SmoothImage(16, 16, true).Get());
    ASSERT_EQ(std::memcmp(&rgb[6], "JFIF", 4), 0);
    Ref<ImageFormat> fmt = MakeFormat("IPLFormat");
    MemoryIO a(rgb);
    EXPECT_TRUE(fmt->CheckFormat(&a)); // the markers pass; the component count does not
    LoadResult r = Load("IPLFormat", rgb);
    EXPECT_FALSE(r.headerOk);
    EXPECT_NE(r.error.find("3"), std::string::npos) << r.error;
    // Our four-component file with its APP14 renamed: no longer an IPL start.
    Bytes four = Save("IPLFormat", SmoothImage(16, 16, true).Get());
    four[6] = 'X';
    MemoryIO b(four);
    EXPECT_FALSE(fmt->CheckFormat(&b));
    EXPECT_EQ(b.Tell(), 0); // the check leaves the stream where it was
    EXPECT_FALSE(Load("IPLFormat", four).headerOk);
    // Fewer than 16 bytes.
    EXPECT_FALSE(Load("IPLFormat", Bytes(four.begin(), four.begin() + 15)).headerOk);
}

} // namespace jpeg_format_test
} // namespace Orvane
