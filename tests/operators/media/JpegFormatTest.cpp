// JpegFormat: write and read back within a stated error, exact agreement with
// djpeg (the same library at the same settings) on files from cjpeg and
// ImageMagick, proxy scaling, regions, density, ICC colour spaces, refusal
// of four-component files, and clean failure on damaged files.
#include <gtest/gtest.h>

#include <atomic>
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
#include "host/flow/Link.h"
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
namespace jpegtest_detail {

using FmtTest::Options;

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

/// A smooth picture with some detail, 8-bit values.
Pixel Smooth(int x, int y) {
    const auto v = [](double t) { return uint16_t(std::lround(127.5 + 120 * std::sin(t)) * 257); };
    return {v(x * 0.05 + y * 0.02), v(y * 0.07 - 1.0), v((x + y) * 0.03 + 2.0), 65535};
}

std::vector<uint8_t> Save(const char *id, Image *img, const Options &opts = {}) {
    return opts.empty() ? FmtTest::Save(id, img) : FmtTest::SaveWith(id, img, opts);
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

/// A binary PPM (P6) or PGM (P5) at 8 bits, grey expanded to RGB.
struct Pnm {
    int w = 0, h = 0;
    std::vector<uint8_t> rgb;
};

bool ReadPnm(const std::vector<uint8_t> &d, Pnm &out) {
    if (d.size() < 2 || d[0] != 'P' || (d[1] != '5' && d[1] != '6')) return false;
    const int channels = d[1] == '6' ? 3 : 1;
    size_t i = 2;
    int fields[3], n = 0;
    while (n < 3 && i < d.size()) {
        while (i < d.size() && std::isspace(d[i])) ++i;
        if (i < d.size() && d[i] == '#') {
            while (i < d.size() && d[i] != '\n') ++i;
            continue;
        }
        int v = 0;
        while (i < d.size() && std::isdigit(d[i])) v = v * 10 + (d[i++] - '0');
        fields[n++] = v;
    }
    ++i; // the single white space before the samples
    if (n < 3 || fields[2] != 255) return false;
    out.w = fields[0];
    out.h = fields[1];
    const size_t count = size_t(out.w) * out.h;
    if (d.size() < i + count * channels) return false;
    out.rgb.resize(count * 3);
    for (size_t k = 0; k < count; ++k)
        for (int c = 0; c < 3; ++c) out.rgb[3 * k + c] = d[i + k * channels + (channels == 3 ? c : 0)];
    return true;
}

std::vector<uint8_t> MakePpm(int w, int h, const std::function<Pixel(int, int)> &f) {
    std::string head = "P6\n" + std::to_string(w) + " " + std::to_string(h) + "\n255\n";
    std::vector<uint8_t> d(head.begin(), head.end());
    for (int row = 0; row < h; ++row)
        for (int x = 0; x < w; ++x) {
            const Pixel p = f(x, h - 1 - row);
            d.push_back(uint8_t(p.R >> 8));
            d.push_back(uint8_t(p.G >> 8));
            d.push_back(uint8_t(p.B >> 8));
        }
    return d;
}

/// Mismatching samples between an image and a decoded PNM (top row first).
int Mismatches(const Image &img, const Pnm &pnm) {
    if (img.Width() != pnm.w || img.Height() != pnm.h) return -1;
    int bad = 0;
    for (int row = 0; row < pnm.h; ++row)
        for (int x = 0; x < pnm.w; ++x) {
            const Pixel p = At(img, x, pnm.h - 1 - row);
            const uint8_t *q = &pnm.rgb[(size_t(row) * pnm.w + x) * 3];
            bad += p.R != q[0] * 257 || p.G != q[1] * 257 || p.B != q[2] * 257 || p.A != 65535;
        }
    return bad;
}

class JpegFormatTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

// Default quality (97, no chroma subsampling) on a smooth picture: PSNR above
// 40 dB and no sample off by more than 12 codes; alpha reads as opaque.
TEST_F(JpegFormatTest, WriteReadIsClose) {
    const int w = 96, h = 64;
    Ref<Image> src = MakeImage(w, h, Smooth);
    for (const Options &opts : {Options{}, Options{{"Quality", 90}, {"ChromaSubsampling", 1}}}) {
        SCOPED_TRACE(opts.empty() ? "defaults" : "quality 90, subsampled");
        LoadResult r = Load("JpegFormat", Save("JpegFormat", src.Get(), opts));
        ASSERT_TRUE(r.image) << r.error;
        ASSERT_EQ(r.image->Width(), w);
        ASSERT_EQ(r.image->Height(), h);
        double sq = 0;
        int worst = 0;
        bool opaque = true;
        for (int y = 0; y < h; ++y)
            for (int x = 0; x < w; ++x) {
                const Pixel a = At(*src, x, y), b = At(*r.image, x, y);
                const int d[3] = {(a.R >> 8) - (b.R >> 8), (a.G >> 8) - (b.G >> 8), (a.B >> 8) - (b.B >> 8)};
                for (int e : d) {
                    sq += double(e) * e;
                    worst = std::max(worst, std::abs(e));
                }
                opaque &= b.A == 65535;
            }
        const double psnr = 10 * std::log10(255.0 * 255.0 / (sq / (3.0 * w * h) + 1e-12));
        EXPECT_GT(psnr, opts.empty() ? 40.0 : 34.0);
        EXPECT_LE(worst, opts.empty() ? 12 : 24);
        EXPECT_TRUE(opaque);
    }
}

// Files made by cjpeg and ImageMagick decode exactly as djpeg decodes them
// (the same library with its default settings), and so do our own files.
TEST_F(JpegFormatTest, MatchesDjpeg) {
    TempDir dir;
    const int w = 77, h = 45; // not multiples of the block size
    WriteFile(dir / "in.ppm", MakePpm(w, h, Smooth));
    struct Case {
        const char *name, *command;
    } cases[] = {
        {"cjpeg 4:2:0", "cjpeg -quality 85 IN > OUT"},
        {"cjpeg 4:4:4 progressive", "cjpeg -quality 92 -sample 1x1 -progressive IN > OUT"},
        {"cjpeg grey", "cjpeg -grayscale IN > OUT"},
        {"cjpeg restart markers", "cjpeg -restart 1 -sample 2x1 IN > OUT"},
        {"convert", "convert IN -quality 70 jpg:OUT"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        std::string cmd = c.command;
        cmd.replace(cmd.find("IN"), 2, dir / "in.ppm");
        cmd.replace(cmd.find("OUT"), 3, dir / "f.jpg");
        Shell(cmd);
        Shell("djpeg -pnm " + dir / "f.jpg" + " > " + dir / "f.pnm");
        Pnm ref;
        ASSERT_TRUE(ReadPnm(ReadFile(dir / "f.pnm"), ref));
        LoadResult r = Load("JpegFormat", ReadFile(dir / "f.jpg"));
        ASSERT_TRUE(r.image) << r.error;
        EXPECT_EQ(Mismatches(*r.image, ref), 0);
    }
    // Ours, read by djpeg, ImageMagick's identify agrees on the size.
    Ref<Image> src = MakeImage(w, h, Smooth);
    WriteFile(dir / "ours.jpg", Save("JpegFormat", src.Get(), {{"Quality", 80}, {"ChromaSubsampling", 1}}));
    EXPECT_EQ(Shell("identify -format '%w %h' " + dir / "ours.jpg"), "77 45");
    Shell("djpeg -pnm " + dir / "ours.jpg" + " > " + dir / "ours.pnm");
    Pnm ref;
    ASSERT_TRUE(ReadPnm(ReadFile(dir / "ours.pnm"), ref));
    LoadResult r = Load("JpegFormat", ReadFile(dir / "ours.jpg"));
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(Mismatches(*r.image, ref), 0);
    // Quality and subsampling as ImageMagick reads them back.
    EXPECT_EQ(Shell("identify -format '%Q' " + dir / "ours.jpg"), "80");
    EXPECT_NE(Shell("identify -verbose " + dir / "ours.jpg").find("2x2,1x1,1x1"), std::string::npos);
}

// Proxy scale 2 halves the size (rounding up) through libjpeg's scaling,
// exactly as djpeg -scale 1/2 decodes; 4 quarters it.
TEST_F(JpegFormatTest, ProxyScale) {
    TempDir dir;
    Ref<Image> src = MakeImage(101, 60, Smooth);
    const auto bytes = Save("JpegFormat", src.Get());
    WriteFile(dir / "p.jpg", bytes);
    for (int scale : {2, 4}) {
        SCOPED_TRACE(scale);
        LoadResult r = Load("JpegFormat", bytes, scale);
        ASSERT_TRUE(r.image) << r.error;
        EXPECT_EQ(r.image->Width(), (101 + scale - 1) / scale);
        EXPECT_EQ(r.image->Height(), 60 / scale);
        EXPECT_EQ(r.image->Attrs().GetLong(ImgFullWidth), 101);
        EXPECT_EQ(r.image->Attrs().GetLong(ImgFullHeight), 60);
        Shell("djpeg -pnm -scale 1/" + std::to_string(scale) + " " + dir / "p.jpg" + " > " + dir / "p.pnm");
        Pnm ref;
        ASSERT_TRUE(ReadPnm(ReadFile(dir / "p.pnm"), ref));
        EXPECT_EQ(Mismatches(*r.image, ref), 0);
    }
}

// A region holds exactly the crop of the whole frame, for a subsampled file
// (rows above it are skipped, not decoded).
TEST_F(JpegFormatTest, RegionReadEqualsCrop) {
    Ref<Image> src = MakeImage(70, 53, Smooth);
    const auto bytes = Save("JpegFormat", src.Get(), {{"ChromaSubsampling", 1}});
    LoadResult full = Load("JpegFormat", bytes);
    ASSERT_TRUE(full.image) << full.error;
    for (ImgRectI r : {ImgRectI(5, 7, 22, 19), ImgRectI(0, 52, 70, 53), ImgRectI(0, 0, 70, 1), ImgRectI(60, 30, 90, 90),
                       ImgRectI(-10, -10, 5, 40)}) {
        LoadResult part = Load("JpegFormat", bytes, 1, &r);
        ASSERT_TRUE(part.image) << part.error;
        const ImgRectI want = r & ImgRectI(0, 0, 70, 53);
        EXPECT_EQ(part.image->DataWindow(), want);
        int bad = 0;
        for (int y = want.y0; y < want.y1; ++y)
            for (int x = want.x0; x < want.x1; ++x) bad += !(At(*part.image, x, y) == At(*full.image, x, y));
        EXPECT_EQ(bad, 0) << r.x0 << "," << r.y0 << " " << r.x1 << "," << r.y1;
    }
}

// Density: a custom resolution is written as dots per inch; a file whose
// densities differ reads with the pixel aspect they give.
TEST_F(JpegFormatTest, ResolutionAndAspect) {
    TempDir dir;
    Ref<Image> src = MakeImage(16, 8, Smooth);
    WriteFile(dir / "dpi.jpg", Save("JpegFormat", src.Get(), {{"SetCustomResolution", 1}, {"ResolutionDPI", 150}}));
    EXPECT_EQ(Shell("identify -format '%x %y %U' " + dir / "dpi.jpg"), "150 150 PixelsPerInch");
    // The option is off by default: the resolution is not written then.
    WriteFile(dir / "plain.jpg", Save("JpegFormat", src.Get(), {{"ResolutionDPI", 150}}));
    EXPECT_EQ(Shell("identify -format '%U' " + dir / "plain.jpg"), "Undefined");
    // The defaults otherwise: quality 97, no chroma subsampling.
    EXPECT_EQ(Shell("identify -format '%Q %[jpeg:sampling-factor]' " + dir / "plain.jpg"), "97 1x1,1x1,1x1");

    // Our file with its JFIF densities set to 200 x 100 (no unit) by hand.
    auto wide = Save("JpegFormat", src.Get());
    ASSERT_EQ(std::memcmp(&wide[6], "JFIF", 5), 0);
    const uint8_t density[5] = {0, 0, 200, 0, 100};
    std::memcpy(&wide[13], density, 5);
    WriteFile(dir / "wide.jpg", wide);
    EXPECT_EQ(Shell("identify -format '%x %y' " + dir / "wide.jpg"), "200 100");
    Ref<ImageFormat> fmt = FmtTest::MakeFormat("JpegFormat");
    MemoryIO io(ReadFile(dir / "wide.jpg"));
    ASSERT_TRUE(fmt->LoadHeader(&io)) << fmt->Error();
    // 200 pixels an inch across, 100 down: a pixel is half as wide as high.
    EXPECT_DOUBLE_EQ(fmt->aspectX / fmt->aspectY, 0.5);
}

/// Inserts an APP2 ICC profile marker after SOI.
std::vector<uint8_t> WithICC(const std::vector<uint8_t> &jpeg, const std::vector<uint8_t> &icc) {
    // FF E2, length, "ICC_PROFILE\0", chunk 1 of 1, the profile.
    const size_t len = 2 + 12 + 2 + icc.size();
    std::vector<uint8_t> seg(2 + len, 0);
    seg[0] = 0xFF;
    seg[1] = 0xE2;
    seg[2] = uint8_t(len >> 8);
    seg[3] = uint8_t(len);
    std::memcpy(&seg[4], "ICC_PROFILE", 12);
    seg[16] = 1;
    seg[17] = 1;
    std::memcpy(&seg[18], icc.data(), icc.size());
    std::vector<uint8_t> out = jpeg;
    out.insert(out.begin() + 2, seg.begin(), seg.end());
    return out;
}

/// A minimal ICC profile: a v2 "desc" text and, if gamma8 > 0, a one-entry rTRC curve.
std::vector<uint8_t> Profile(const std::string &desc, int gamma8) {
    std::vector<uint8_t> p(128, 0);
    auto be32 = [&](uint32_t v) {
        for (int s = 24; s >= 0; s -= 8) p.push_back(uint8_t(v >> s));
    };
    const uint32_t tags = gamma8 > 0 ? 2 : 1;
    be32(tags);
    const uint32_t descAt = 132 + 12 * tags, descLen = 12 + uint32_t(desc.size()) + 1;
    const uint32_t curveAt = (descAt + descLen + 3) & ~3u;
    p.insert(p.end(), {'d', 'e', 's', 'c'});
    be32(descAt);
    be32(descLen);
    if (gamma8 > 0) {
        p.insert(p.end(), {'r', 'T', 'R', 'C'});
        be32(curveAt);
        be32(14);
    }
    p.insert(p.end(), {'d', 'e', 's', 'c', 0, 0, 0, 0});
    be32(uint32_t(desc.size()) + 1);
    p.insert(p.end(), desc.begin(), desc.end());
    p.push_back(0);
    p.resize(curveAt, 0);
    if (gamma8 > 0) {
        p.insert(p.end(), {'c', 'u', 'r', 'v', 0, 0, 0, 0});
        be32(1);
        p.push_back(uint8_t(gamma8 >> 8));
        p.push_back(uint8_t(gamma8));
    }
    const uint32_t size = uint32_t(p.size());
    for (int i = 0; i < 4; ++i) p[i] = uint8_t(size >> (24 - 8 * i));
    return p;
}

// The words of the profile's description name the colour space; a power
// tone curve gives the gamma.
TEST_F(JpegFormatTest, ICCProfileFillsMetadata) {
    Ref<Image> src = MakeImage(8, 8, Smooth);
    const auto plain = Save("JpegFormat", src.Get());
    struct Case {
        const char *desc;
        int gamma8;
        const char *space;
    } cases[] = {
        {"sRGB IEC61966-2.1", 0, "sRGB"},     {"Adobe RGB (1998)", 563, "AdobeRGB"}, // 563 / 256 = 2.19921875
        {"ProPhoto RGB", 461, "ProPhotoRGB"}, {"My Rec 709 display", 0, "Rec709"},   {"Something else", 563, nullptr},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.desc);
        LoadResult r = Load("JpegFormat", WithICC(plain, Profile(c.desc, c.gamma8)));
        ASSERT_TRUE(r.image) << r.error;
        const ScriptVal &md = r.image->Metadata();
        const ScriptVal *cs = md.IsTable() ? md.Find("ColorSpace") : nullptr;
        if (!c.space) {
            EXPECT_EQ(cs, nullptr);
            continue;
        }
        ASSERT_TRUE(cs && cs->IsText());
        EXPECT_EQ(cs->AsText(), c.space);
        const ScriptVal *id = md.Find("ColorSpaceID");
        ASSERT_TRUE(id && id->IsText());
        EXPECT_EQ(id->AsText(), c.space);
        const ScriptVal *space = md.Find("GammaSpace");
        if (c.gamma8 == 0) {
            EXPECT_EQ(space, nullptr);
        } else {
            ASSERT_TRUE(space && space->IsTable());
            const ScriptVal *g = space->Find("Gamma");
            ASSERT_TRUE(g && g->IsNumber());
            EXPECT_DOUBLE_EQ(g->AsNumber(), c.gamma8 / 256.0);
        }
    }
}

// The resolution slider shows only while a custom resolution is asked for.
TEST_F(JpegFormatTest, ResolutionSliderFollowsItsCheckbox) {
    OrvaneDoc doc;
    Operator *tool = Orvane::Test::AddImageSource(doc, "saver", nullptr);
    Ref<ImageFormat> fmt = FmtTest::MakeFormat("JpegFormat");
    fmt->AddSaveInputs(tool);
    Input *check = tool->FindInput("SetCustomResolution"), *dpi = tool->FindInput("ResolutionDPI");
    ASSERT_TRUE(check && dpi);
    EXPECT_FALSE(dpi->IsVisible());
    Ref<Parameter> on = MakeRef<Number>(1.0), off = MakeRef<Number>(0.0);
    fmt->NotifyChangedSave(tool, check, on.Get(), 0.0);
    EXPECT_TRUE(dpi->IsVisible());
    fmt->NotifyChangedSave(tool, check, off.Get(), 0.0);
    EXPECT_FALSE(dpi->IsVisible());
}

// Four components are IPL's: refused here with a reason that says so.
TEST_F(JpegFormatTest, FourComponentFileRefused) {
    TempDir dir;
    WriteFile(dir / "in.ppm", MakePpm(12, 10, Smooth));
    Shell("convert " + dir / "in.ppm" + " -colorspace CMYK " + dir / "cmyk.jpg");
    ASSERT_EQ(Shell("identify -format '%[colorspace]' " + dir / "cmyk.jpg"), "CMYK");
    LoadResult r = Load("JpegFormat", ReadFile(dir / "cmyk.jpg"));
    EXPECT_FALSE(r.headerOk);
    EXPECT_FALSE(r.image);
    EXPECT_NE(r.error.find("IPL"), std::string::npos) << r.error;
}

/// A stream that refuses writes past `limit` bytes.
class ShortDisk : public MemoryIO {
public:
    explicit ShortDisk(int64_t limit) : limit_(limit) {}
    int64_t Write(const void *buffer, int64_t bytes) override {
        if (Tell() + bytes > limit_) return 0;
        return MemoryIO::Write(buffer, bytes);
    }

private:
    int64_t limit_;
};

// Truncation anywhere before the end of the picture data fails with a
// reason; broken headers fail; a full disk fails the write.
TEST_F(JpegFormatTest, DamagedFilesFailCleanly) {
    Ref<Image> src = MakeImage(64, 48, Smooth);
    const auto bytes = Save("JpegFormat", src.Get());
    ASSERT_TRUE(Load("JpegFormat", bytes).image);
    for (int k = 0; k < 10; ++k) {
        const size_t n = bytes.size() * k / 10 + (k ? 0 : 1);
        LoadResult r = Load("JpegFormat", std::vector<uint8_t>(bytes.begin(), bytes.begin() + n));
        EXPECT_FALSE(r.image) << n;
        EXPECT_FALSE(r.error.empty()) << n;
    }
    // Frame header (SOF) with zero components, and with 12-bit precision.
    size_t sof = 2;
    while (sof + 1 < bytes.size() && !(bytes[sof] == 0xFF && bytes[sof + 1] == 0xC0)) ++sof;
    ASSERT_LT(sof + 9, bytes.size());
    auto bad = bytes;
    bad[sof + 9] = 0;
    EXPECT_FALSE(Load("JpegFormat", bad).image);
    bad = bytes;
    bad[sof + 4] = 12;
    EXPECT_FALSE(Load("JpegFormat", bad).image);
    // Scrambled picture data decodes to something of the right size or fails; never more.
    bad = bytes;
    for (size_t i = bytes.size() / 2; i < bytes.size() / 2 + 200; ++i) bad[i] = uint8_t(i * 37);
    LoadResult r = Load("JpegFormat", bad);
    if (r.image) {
        EXPECT_EQ(r.image->Width(), 64);
    }
    // Not a JPEG.
    Ref<ImageFormat> fmt = FmtTest::MakeFormat("JpegFormat");
    MemoryIO junk(std::vector<uint8_t>(64, 0x11));
    EXPECT_FALSE(fmt->CheckFormat(&junk));
    EXPECT_FALSE(fmt->LoadHeader(&junk));
    MemoryIO good(bytes);
    EXPECT_TRUE(fmt->CheckFormat(&good));

    for (int64_t limit : {int64_t(0), int64_t(100), int64_t(bytes.size() - 10)}) {
        Ref<ImageFormat> saver = FmtTest::MakeFormat("JpegFormat");
        saver->SetupSave(nullptr, nullptr);
        ShortDisk disk(limit);
        ASSERT_TRUE(saver->SaveHeader(&disk, src.Get()));
        EXPECT_FALSE(saver->SaveFrame(0, src.Get())) << limit;
        EXPECT_FALSE(saver->Error().empty());
    }
}

// Deterministic byte damage all over a file, for both JPEG readers: each read
// either fails with a reason or gives an image of a sane size (the run under
// the address and undefined behaviour sanitizers is what watches memory).
TEST_F(JpegFormatTest, ScatteredDamageNeverBreaksTheReader) {
    Ref<Image> src = MakeImage(40, 24, Smooth);
    const auto bytes = Save("JpegFormat", src.Get(), {{"ChromaSubsampling", 1}});
    uint32_t state = 12345;
    auto next = [&state] { return state = state * 1664525u + 1013904223u; };
    int failed = 0;
    for (int round = 0; round < 300; ++round) {
        auto bad = bytes;
        const int hits = 1 + int(next() % 4);
        for (int i = 0; i < hits; ++i) bad[2 + next() % (bad.size() - 2)] = uint8_t(next() >> 24);
        if (round % 3 == 0) bad.resize(2 + next() % (bad.size() - 2));
        for (const char *id : {"JpegFormat", "IPLFormat"}) {
            LoadResult r = Load(id, bad);
            if (r.image) {
                EXPECT_GT(r.image->Width(), 0);
                EXPECT_LE(r.image->Width(), 65535);
            } else {
                ++failed;
                EXPECT_FALSE(r.error.empty());
            }
        }
    }
    EXPECT_GE(failed, 300); // every IPL read fails (three components), and the truncated JPEGs
}

// A set abort word ends reading and writing with false, for both JPEG kinds.
TEST_F(JpegFormatTest, AbortWordStopsReadAndWrite) {
    Ref<Image> src = MakeImage(20, 10, Smooth);
    std::atomic<bool> abort{true};
    for (const char *id : {"JpegFormat", "IPLFormat"}) {
        SCOPED_TRACE(id);
        Ref<ImageFormat> saver = FmtTest::MakeFormat(id);
        saver->SetupSave(nullptr, nullptr);
        MemoryIO out;
        ASSERT_TRUE(saver->SaveHeader(&out, src.Get()));
        ASSERT_TRUE(saver->SaveFrame(0, src.Get())) << saver->Error();
        Ref<ImageFormat> fmt = FmtTest::MakeFormat(id);
        MemoryIO in(out.Data());
        ASSERT_TRUE(fmt->LoadHeader(&in)) << fmt->Error();
        fmt->abortFlag = &abort;
        Ref<Image> img;
        EXPECT_FALSE(fmt->LoadFrameTagList(0, img, TagList()));
        EXPECT_EQ(fmt->Error(), "aborted");
        saver->abortFlag = &abort;
        MemoryIO again;
        ASSERT_TRUE(saver->SaveHeader(&again, src.Get()));
        EXPECT_FALSE(saver->SaveFrame(0, src.Get()));
        EXPECT_EQ(saver->Error(), "aborted");
    }
}

// A frame asked for header data only gets no pixels and no decoding.
TEST_F(JpegFormatTest, HeaderOnlyFrame) {
    Ref<Image> src = MakeImage(20, 10, Smooth);
    auto bytes = Save("JpegFormat", src.Get());
    size_t sos = 2;
    while (sos + 1 < bytes.size() && !(bytes[sos] == 0xFF && bytes[sos + 1] == 0xDA)) ++sos;
    bytes.resize(sos + 20); // the pixel data is not even there
    Ref<ImageFormat> fmt = FmtTest::MakeFormat("JpegFormat");
    MemoryIO io(bytes);
    ASSERT_TRUE(fmt->LoadHeader(&io)) << fmt->Error();
    Ref<Image> img;
    ASSERT_TRUE(fmt->LoadFrameTagList(0, img, TagList{{ClipFrameHeaderOnly, 1}})) << fmt->Error();
    EXPECT_EQ(img->Width(), 20);
    EXPECT_FALSE(img->HasScanLineData());
}

} // namespace jpegtest_detail
} // namespace Orvane
