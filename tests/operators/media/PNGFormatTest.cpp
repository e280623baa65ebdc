// PNGFormat: exact round trips at both depths, the alpha division and
// multiplication, colour chunks through Metadata, files read by and made by
// ImageMagick, regions, and clean failure on damaged files and streams.
#include <gtest/gtest.h>
#include <zlib.h>

#include <atomic>
#include <cmath>
#include <cstdio>
#include <cstdlib>
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
namespace pngtest_detail {

using Options = std::vector<std::pair<const char *, double>>;

Ref<ImageFormat> NewFormat() { return NewImageFormat(ClassRegistry->Find(OvID("PNGFormat"), RegFamilyImageFormat)); }

Ref<Image> MakeImage(int w, int h, int depth, const std::function<Pixel(int, int)> &f) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    img->AllocScanLineData();
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const Pixel p = f(x, y);
            StorePixel(depth, &p, 1, img->PixelAddress(x, y));
        }
    return img;
}

using FmtTest::At;

/// Applies options to a format through a tool's inputs and a request, as a saver or loader would.
struct OptionRig {
    OrvaneDoc doc;
    Operator *tool = nullptr;
    std::vector<Ref<Parameter>> values;

    void Apply(ImageFormat &fmt, const Options &opts, bool save) {
        if (opts.empty()) {
            save ? fmt.SetupSave(nullptr, nullptr) : fmt.SetupLoad(nullptr, nullptr);
            return;
        }
        tool = Orvane::Test::AddImageSource(doc, save ? "saver" : "loader", nullptr);
        ASSERT_NE(tool, nullptr);
        save ? fmt.AddSaveInputs(tool) : fmt.AddLoadInputs(tool);
        Request req(tool, nullptr, 0.0, 0, nullptr);
        for (const auto &[id, v] : opts) {
            Input *in = tool->FindInput(id);
            ASSERT_NE(in, nullptr) << id;
            values.push_back(MakeRef<Number>(v));
            req.SetInputData(in, values.back().Get());
        }
        save ? fmt.SetupSave(tool, &req) : fmt.SetupLoad(tool, &req);
    }
};

std::vector<uint8_t> Save(Image *img, const Options &opts = {}) {
    Ref<ImageFormat> fmt = NewFormat();
    EXPECT_TRUE(fmt);
    if (!fmt) return {};
    OptionRig rig;
    rig.Apply(*fmt, opts, true);
    MemoryIO io;
    EXPECT_TRUE(fmt->SaveHeader(&io, img)) << fmt->Error();
    EXPECT_TRUE(fmt->SaveFrame(0, img)) << fmt->Error();
    return io.Data();
}

/// Loads a whole file; null with `error` set on failure.
Ref<Image> Load(const std::vector<uint8_t> &bytes, const Options &opts = {}, const ImgRectI *region = nullptr,
                std::string *error = nullptr) {
    Ref<ImageFormat> fmt = NewFormat();
    if (!fmt) return nullptr;
    OptionRig rig;
    rig.Apply(*fmt, opts, false);
    MemoryIO io(bytes);
    Ref<Image> img;
    ImageDomain domain(region ? *region : ImgRectI());
    TagList tags;
    if (region) tags.Add({ClipFrameRegion, static_cast<const void *>(&domain)});
    if (!fmt->LoadHeader(&io) || !fmt->LoadFrameTagList(0, img, tags)) {
        if (error) *error = fmt->Error();
        return nullptr;
    }
    return img;
}

using FmtTest::ReadFile;
using FmtTest::TempDir;
using FmtTest::WriteFile;

std::string Shell(const std::string &command) { return FmtTest::CaptureText(command); }

/// A premultiplied test picture: colour never above alpha, some alpha 0 and 1.
Pixel Premultiplied(int x, int y, bool sixteen) {
    const uint32_t max = sixteen ? 65535 : 255;
    const uint32_t a = (x == 0) ? 0 : (x == 1) ? max : (uint32_t(x * 37 + y * 91) % (max + 1));
    const uint32_t r = a ? uint32_t(x * 13 + y * 7) % (a + 1) : 0, g = a ? uint32_t(x * y * 29) % (a + 1) : 0;
    const uint32_t b = a;
    const uint32_t k = sixteen ? 1 : 257;
    return {uint16_t(r * k), uint16_t(g * k), uint16_t(b * k), uint16_t(a * k)};
}

class PNGFormatTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

// Straight values (no division, no multiplication) come back exactly at both
// depths, with and without alpha, and the depth "Auto" follows the image.
TEST_F(PNGFormatTest, WriteReadIsExact) {
    for (int depth : {DepthRGBAInt8, DepthRGBAInt16})
        for (bool alpha : {false, true}) {
            SCOPED_TRACE("depth " + std::to_string(depth) + (alpha ? " alpha" : " no alpha"));
            const bool sixteen = depth == DepthRGBAInt16;
            Ref<Image> src = MakeImage(37, 23, depth, [&](int x, int y) {
                const uint16_t k = sixteen ? 1 : 257, m = sixteen ? 65535 : 255;
                return Pixel{uint16_t((x * 977 + y * 31) % (m + 1) * k), uint16_t((x * y * 13 + 5) % (m + 1) * k),
                             uint16_t((y * 4099) % (m + 1) * k), uint16_t((x * 3 + y * 5) % (m + 1) * k)};
            });
            const auto bytes = Save(src.Get(), {{"SaveAlpha", alpha}, {"PreDivide", 0}});
            Ref<Image> back = Load(bytes, {{"PostMultiply", 0}});
            ASSERT_TRUE(back);
            EXPECT_EQ(back->Depth(), depth);
            ASSERT_EQ(back->Width(), 37);
            ASSERT_EQ(back->Height(), 23);
            int bad = 0;
            for (int y = 0; y < 23; ++y)
                for (int x = 0; x < 37; ++x) {
                    Pixel want = At(*src, x, y);
                    if (!alpha) want.A = 65535;
                    bad += !(At(*back, x, y) == want);
                }
            EXPECT_EQ(bad, 0);
        }
}

// With the default options the file holds straight colour, computed here
// independently from ImageMagick's reading of it, and reading multiplies
// back to the very premultiplied values we started from.
TEST_F(PNGFormatTest, DivideAndMultiplyByAlpha) {
    TempDir dir;
    for (bool sixteen : {false, true}) {
        SCOPED_TRACE(sixteen ? "16 bit" : "8 bit");
        const int w = 64, h = 9;
        Ref<Image> src = MakeImage(w, h, sixteen ? DepthRGBAInt16 : DepthRGBAInt8,
                                   [&](int x, int y) { return Premultiplied(x, y, sixteen); });
        const auto bytes = Save(src.Get());
        Ref<Image> back = Load(bytes);
        ASSERT_TRUE(back);
        int bad = 0;
        for (int y = 0; y < h; ++y)
            for (int x = 0; x < w; ++x) bad += !(At(*back, x, y) == At(*src, x, y));
        EXPECT_EQ(bad, 0) << "premultiplied values changed in the round trip";

        // The stored samples, top row first, as ImageMagick reads them.
        WriteFile(dir / "a.png", bytes);
        const std::string depthArg = sixteen ? "16" : "8";
        Shell("convert " + dir / "a.png" + " -depth " + depthArg + " -endian MSB rgba:" + dir / "a.raw");
        const auto raw = ReadFile(dir / "a.raw");
        const size_t bps = sixteen ? 2 : 1;
        ASSERT_EQ(raw.size(), size_t(w) * h * 4 * bps);
        const double max = sixteen ? 65535.0 : 255.0;
        bad = 0;
        for (int row = 0; row < h; ++row)
            for (int x = 0; x < w; ++x) {
                const Pixel p = Premultiplied(x, h - 1 - row, sixteen);
                const double k = sixteen ? 1.0 : 257.0;
                const double a = p.A / k, c[3] = {p.R / k, p.G / k, p.B / k};
                for (int ch = 0; ch < 4; ++ch) {
                    const size_t at = ((size_t(row) * w + x) * 4 + ch) * bps;
                    const unsigned got = sixteen ? (raw[at] << 8 | raw[at + 1]) : raw[at];
                    const double want = ch == 3 ? a : a == 0 ? c[ch] : std::min(max, std::floor(c[ch] * max / a + 0.5));
                    bad += got != static_cast<unsigned>(want);
                }
            }
        EXPECT_EQ(bad, 0) << "stored straight colour differs";
    }
}

// Depth "int16" widens an 8-bit image by 257, "int8" narrows by >> 8; the
// file's own bit depth agrees (identify).
TEST_F(PNGFormatTest, DepthOption) {
    TempDir dir;
    Ref<Image> eight = MakeImage(5, 4, DepthRGBAInt8, [](int x, int y) {
        return Pixel{uint16_t(x * 50 * 257), uint16_t(y * 60 * 257), 257 * 7, 65535};
    });
    const auto wide = Save(eight.Get(), {{"Depth", 2}, {"SaveAlpha", 0}});
    WriteFile(dir / "w.png", wide);
    EXPECT_EQ(Shell("identify -format '%z %w %h' " + dir / "w.png"), "16 5 4");
    Ref<Image> back = Load(wide);
    ASSERT_TRUE(back);
    EXPECT_EQ(back->Depth(), DepthRGBAInt16);
    EXPECT_EQ(At(*back, 3, 2), (Pixel{150 * 257, 120 * 257, 7 * 257, 65535}));

    Ref<Image> sixteen = MakeImage(3, 2, DepthRGBAInt16, [](int x, int y) {
        return Pixel{uint16_t(x * 20000 + 255), uint16_t(y * 511), 65535, 65535};
    });
    const auto narrow = Save(sixteen.Get(), {{"Depth", 1}});
    WriteFile(dir / "n.png", narrow);
    EXPECT_EQ(Shell("identify -format '%z' " + dir / "n.png"), "8");
    back = Load(narrow);
    ASSERT_TRUE(back);
    EXPECT_EQ(back->Depth(), DepthRGBAInt8);
    const Pixel p = At(*back, 2, 1);
    EXPECT_EQ(p.R, ((2 * 20000 + 255) >> 8) * 257);
    EXPECT_EQ(p.G, (511 >> 8) * 257);
}

// sRGB and gAMA chunks: written by mode, read into Metadata, seen by
// ImageMagick, and written again in mode "Auto" from the read Metadata.
TEST_F(PNGFormatTest, ColourChunksThroughMetadata) {
    TempDir dir;
    Ref<Image> src = MakeImage(4, 4, DepthRGBAInt8, [](int x, int y) {
        return Pixel{uint16_t(x * 4000), uint16_t(y * 4000), 0, 65535};
    });

    const auto srgb = Save(src.Get(), {{"GammaMode", 2}});
    Ref<Image> a = Load(srgb);
    ASSERT_TRUE(a);
    const ScriptVal *cs = a->Metadata().Find("ColorSpace");
    ASSERT_TRUE(cs && cs->IsText());
    EXPECT_EQ(cs->AsText(), "sRGB");
    WriteFile(dir / "s.png", srgb);
    EXPECT_NE(Shell("identify -verbose " + dir / "s.png").find("png:sRGB: intent=3"), std::string::npos);

    const auto gam = Save(src.Get(), {{"GammaMode", 3}, {"Gamma", 2.2}});
    Ref<Image> b = Load(gam);
    ASSERT_TRUE(b);
    EXPECT_EQ(b->Metadata().Find("ColorSpace"), nullptr);
    const ScriptVal *g = b->Metadata().Find("Gamma");
    ASSERT_TRUE(g && g->IsNumber());
    EXPECT_NEAR(g->AsNumber(), 2.2, 1e-4); // gAMA holds 1 / 2.2 in units of 1e-5
    WriteFile(dir / "g.png", gam);
    EXPECT_NEAR(std::atof(Shell("identify -format '%[gamma]' " + dir / "g.png").c_str()), 1 / 2.2, 1e-5);

    // Mode "None" writes neither; "Gamma" at 0 writes nothing either.
    for (const Options &o : {Options{{"GammaMode", 1}}, Options{{"GammaMode", 3}, {"Gamma", 0}}}) {
        Ref<Image> c = Load(Save(src.Get(), o));
        ASSERT_TRUE(c);
        EXPECT_EQ(c->Metadata().Find("ColorSpace"), nullptr);
        EXPECT_EQ(c->Metadata().Find("Gamma"), nullptr);
    }

    // "Auto" writes what the image's Metadata says.
    Ref<Image> again = Load(Save(b.Get()));
    ASSERT_TRUE(again);
    g = again->Metadata().Find("Gamma");
    ASSERT_TRUE(g && g->IsNumber());
    EXPECT_NEAR(g->AsNumber(), 2.2, 1e-4);
    again = Load(Save(a.Get()));
    ASSERT_TRUE(again);
    cs = again->Metadata().Find("ColorSpace");
    ASSERT_TRUE(cs && cs->IsText());
    EXPECT_EQ(cs->AsText(), "sRGB");
    // A plain image gets no chunk.
    again = Load(Save(src.Get()));
    ASSERT_TRUE(again);
    EXPECT_EQ(again->Metadata().Size(), 0u);
}

// Files ImageMagick writes: RGBA, interlaced, grey (palette) and 16-bit, compared with the
// raw samples they were made from.
TEST_F(PNGFormatTest, ReadsFilesMadeByImageMagick) {
    TempDir dir;
    const int w = 19, h = 7;
    std::vector<uint8_t> rgba(w * h * 4), grey(w * h);
    for (int i = 0; i < w * h; ++i) {
        rgba[4 * i] = uint8_t(i * 7);
        rgba[4 * i + 1] = uint8_t(i * 13 + 1);
        rgba[4 * i + 2] = uint8_t(255 - i);
        rgba[4 * i + 3] = uint8_t(i * 3 + 40);
        grey[i] = uint8_t(i * 11);
    }
    WriteFile(dir / "rgba.raw", rgba);
    WriteFile(dir / "grey.raw", grey);
    const std::string size = " -size " + std::to_string(w) + "x" + std::to_string(h);
    Shell("convert" + size + " -depth 8 rgba:" + dir / "rgba.raw" + " PNG32:" + dir / "rgba.png");
    Shell("convert" + size + " -depth 8 gray:" + dir / "grey.raw" + " PNG8:" + dir / "grey.png");
    Shell("convert" + size + " -depth 8 rgba:" + dir / "rgba.raw" + " -depth 16 PNG64:" + dir / "rgba16.png");
    Shell("convert" + size + " -depth 8 rgba:" + dir / "rgba.raw" + " -interlace PNG PNG32:" + dir / "adam7.png");
    ASSERT_EQ(Shell("identify -format '%[interlace]' " + dir / "adam7.png"), "PNG");

    auto check = [&](const std::string &file, int depth, auto want) {
        SCOPED_TRACE(file);
        Ref<Image> img = Load(ReadFile(dir / file), {{"PostMultiply", 0}});
        ASSERT_TRUE(img);
        EXPECT_EQ(img->Depth(), depth);
        ASSERT_EQ(img->Width(), w);
        ASSERT_EQ(img->Height(), h);
        int bad = 0;
        for (int row = 0; row < h; ++row)
            for (int x = 0; x < w; ++x) bad += !(At(*img, x, h - 1 - row) == want(row * w + x));
        EXPECT_EQ(bad, 0);
    };
    check("rgba.png", DepthRGBAInt8, [&](int i) {
        return Pixel{uint16_t(rgba[4 * i] * 257), uint16_t(rgba[4 * i + 1] * 257), uint16_t(rgba[4 * i + 2] * 257),
                     uint16_t(rgba[4 * i + 3] * 257)};
    });
    check("adam7.png", DepthRGBAInt8, [&](int i) {
        return Pixel{uint16_t(rgba[4 * i] * 257), uint16_t(rgba[4 * i + 1] * 257), uint16_t(rgba[4 * i + 2] * 257),
                     uint16_t(rgba[4 * i + 3] * 257)};
    });
    check("rgba16.png", DepthRGBAInt16, [&](int i) {
        return Pixel{uint16_t(rgba[4 * i] * 257), uint16_t(rgba[4 * i + 1] * 257), uint16_t(rgba[4 * i + 2] * 257),
                     uint16_t(rgba[4 * i + 3] * 257)};
    });
    check("grey.png", DepthRGBAInt8, [&](int i) {
        const uint16_t v = uint16_t(grey[i] * 257);
        return Pixel{v, v, v, 65535};
    });
}

// Our files as ImageMagick sees them: size and samples.
TEST_F(PNGFormatTest, FilesWeWriteReadByImageMagick) {
    TempDir dir;
    const int w = 33, h = 17;
    Ref<Image> src = MakeImage(w, h, DepthRGBAInt8, [](int x, int y) {
        return Pixel{uint16_t(x * 7 * 257), uint16_t(y * 15 * 257), uint16_t((x ^ y) * 257), 65535};
    });
    WriteFile(dir / "o.png", Save(src.Get(), {{"SaveAlpha", 0}}));
    EXPECT_EQ(Shell("identify -format '%w %h' " + dir / "o.png"), "33 17");
    Shell("convert " + dir / "o.png" + " -depth 8 rgb:" + dir / "o.raw");
    const auto raw = ReadFile(dir / "o.raw");
    ASSERT_EQ(raw.size(), size_t(w) * h * 3);
    int bad = 0;
    for (int row = 0; row < h; ++row)
        for (int x = 0; x < w; ++x) {
            const uint8_t *p = &raw[(size_t(row) * w + x) * 3];
            const int y = h - 1 - row;
            bad += p[0] != x * 7 || p[1] != y * 15 || p[2] != (x ^ y);
        }
    EXPECT_EQ(bad, 0);
}

// A region read holds exactly the crop of the full read, and only the window.
TEST_F(PNGFormatTest, RegionReadEqualsCrop) {
    Ref<Image> src = MakeImage(40, 30, DepthRGBAInt16, [](int x, int y) { return Premultiplied(x + 3, y, true); });
    const auto bytes = Save(src.Get());
    Ref<Image> full = Load(bytes);
    ASSERT_TRUE(full);
    for (ImgRectI r :
         {ImgRectI(5, 7, 22, 19), ImgRectI(0, 0, 40, 1), ImgRectI(39, 29, 50, 50), ImgRectI(-5, 20, 3, 40)}) {
        Ref<Image> part = Load(bytes, {}, &r);
        ASSERT_TRUE(part);
        const ImgRectI want = r & ImgRectI(0, 0, 40, 30);
        EXPECT_EQ(part->DataWindow(), want);
        int bad = 0;
        for (int y = want.y0; y < want.y1; ++y)
            for (int x = want.x0; x < want.x1; ++x) bad += !(At(*part, x, y) == At(*full, x, y));
        EXPECT_EQ(bad, 0);
    }
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

// Damaged files and full disks end in a clean false with a reason.
TEST_F(PNGFormatTest, DamagedFilesFailCleanly) {
    Ref<Image> src = MakeImage(50, 40, DepthRGBAInt8, [](int x, int y) { return Premultiplied(x, y, false); });
    const auto bytes = Save(src.Get(), {{"CompressionLevel", 0}});
    ASSERT_TRUE(Load(bytes));
    for (size_t n : {size_t(0), size_t(7), size_t(8), size_t(20), size_t(33), size_t(60), bytes.size() / 3,
                     bytes.size() / 2, bytes.size() - 13}) {
        std::string why;
        EXPECT_FALSE(Load(std::vector<uint8_t>(bytes.begin(), bytes.begin() + n), {}, nullptr, &why)) << n;
        EXPECT_FALSE(why.empty()) << n;
    }
    // A flipped byte in the pixel data breaks the chunk's checksum.
    auto bad = bytes;
    bad[bad.size() / 2] ^= 0x5a;
    std::string why;
    EXPECT_FALSE(Load(bad, {}, nullptr, &why));
    EXPECT_FALSE(why.empty());
    // A text chunk stating 2 GB in a small file (found by fuzzing): skipped
    // unread, not set aside at that size (the sanitizer run refuses such
    // blocks), so the file ends early.
    auto huge = bytes;
    const uint8_t chunk[] = {0x7f, 0xff, 0xff, 0xf0, 't', 'E', 'X', 't'};
    huge.insert(huge.begin() + 33, std::begin(chunk), std::end(chunk));
    EXPECT_FALSE(Load(huge, {}, nullptr, &why));
    EXPECT_NE(why.find("truncated"), std::string::npos) << why;
    // A 16-bit RGB file whose tRNS chunk (white, a colour it does not use)
    // comes before a PLTE chunk (found by fuzzing): libpng drops the
    // transparency, so the rows carry no alpha although the header promised
    // some; the pixels read as they are, opaque.
    Ref<Image> rgb = MakeImage(5, 3, DepthRGBAInt16, [](int x, int y) {
        return Pixel{uint16_t(x * 999), 7, uint16_t(y), 65535};
    });
    auto early = Save(rgb.Get(), {{"SaveAlpha", 0}, {"Depth", 2}});
    const std::vector<uint8_t> palette = {1, 2, 3}, white(6, 0xff);
    for (const auto &[type, data] : {std::pair{"PLTE", palette}, std::pair{"tRNS", white}}) {
        std::vector<uint8_t> chunk = {0, 0, 0, uint8_t(data.size())};
        chunk.insert(chunk.end(), type, type + 4);
        chunk.insert(chunk.end(), data.begin(), data.end());
        const uLong crc = crc32(0, chunk.data() + 4, static_cast<uInt>(chunk.size() - 4));
        for (int shift : {24, 16, 8, 0}) chunk.push_back(uint8_t(crc >> shift));
        early.insert(early.begin() + 33, chunk.begin(), chunk.end()); // after the header: tRNS, then PLTE
    }
    Ref<Image> opaque = Load(early, {}, nullptr, &why);
    ASSERT_TRUE(opaque) << why;
    for (int y = 0; y < 3; ++y)
        for (int x = 0; x < 5; ++x) EXPECT_EQ(At(*opaque, x, y), At(*rgb, x, y)) << x << "," << y;
    // Not a PNG at all.
    Ref<ImageFormat> fmt = NewFormat();
    MemoryIO junk(std::vector<uint8_t>(100, 0x42));
    EXPECT_FALSE(fmt->CheckFormat(&junk));
    EXPECT_FALSE(fmt->LoadHeader(&junk));

    for (int64_t limit : {int64_t(0), int64_t(40), int64_t(bytes.size() / 2)}) {
        Ref<ImageFormat> saver = NewFormat();
        saver->SetupSave(nullptr, nullptr);
        ShortDisk disk(limit);
        ASSERT_TRUE(saver->SaveHeader(&disk, src.Get()));
        EXPECT_FALSE(saver->SaveFrame(0, src.Get())) << limit;
        EXPECT_FALSE(saver->Error().empty());
    }
}

// A set abort word ends reading and writing with false.
TEST_F(PNGFormatTest, AbortWordStopsReadAndWrite) {
    Ref<Image> src = MakeImage(20, 10, DepthRGBAInt8, [](int x, int y) { return Premultiplied(x, y, false); });
    const auto bytes = Save(src.Get());
    std::atomic<bool> abort{true};
    Ref<ImageFormat> fmt = NewFormat();
    MemoryIO in(bytes);
    ASSERT_TRUE(fmt->LoadHeader(&in)) << fmt->Error();
    fmt->abortFlag = &abort;
    Ref<Image> img;
    EXPECT_FALSE(fmt->LoadFrameTagList(0, img, TagList()));
    EXPECT_EQ(fmt->Error(), "aborted");
    Ref<ImageFormat> saver = NewFormat();
    saver->SetupSave(nullptr, nullptr);
    saver->abortFlag = &abort;
    MemoryIO out;
    ASSERT_TRUE(saver->SaveHeader(&out, src.Get()));
    EXPECT_FALSE(saver->SaveFrame(0, src.Get()));
    EXPECT_EQ(saver->Error(), "aborted");
}

// Deterministic byte damage all over a file: each read fails with a reason or
// gives an image of the stored size (the sanitizer run watches memory).
TEST_F(PNGFormatTest, ScatteredDamageNeverBreaksTheReader) {
    Ref<Image> src = MakeImage(40, 24, DepthRGBAInt16, [](int x, int y) { return Premultiplied(x, y, true); });
    const auto bytes = Save(src.Get());
    uint32_t state = 777;
    auto next = [&state] { return state = state * 1664525u + 1013904223u; };
    int failed = 0;
    for (int round = 0; round < 300; ++round) {
        auto bad = bytes;
        const int hits = 1 + int(next() % 4);
        for (int i = 0; i < hits; ++i) bad[8 + next() % (bad.size() - 8)] = uint8_t(next() >> 24);
        if (round % 3 == 0) bad.resize(8 + next() % (bad.size() - 8));
        std::string why;
        Ref<Image> img = Load(bad, {}, nullptr, &why);
        if (img) {
            EXPECT_EQ(img->Width(), 40);
            EXPECT_EQ(img->Height(), 24);
        } else {
            ++failed;
            EXPECT_FALSE(why.empty());
        }
    }
    EXPECT_GE(failed, 100); // the checksums catch nearly every hit
}

} // namespace pngtest_detail
} // namespace Orvane
