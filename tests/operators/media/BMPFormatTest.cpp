// BMPFormat: our own round trips at 24 and 32 bits, files made by netpbm and
// ImageMagick, our files read by them, short headers with palettes, strides,
// region reads, the abort word, options, and damaged files.
#include <cstring>

#include "host/media/ImageFormatList.h"

#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace bmp_format_test {

using namespace Orvane::FmtTest;

class BMPFormatTest : public FormatSuite {};

/// Large enough that the Targa and Raw writers go through several lines.
Ref<Image> Rich8ForWrite() { return Image8(150, 20, 9); }

uint32_t U32(const Bytes &b, size_t at) { return b[at] | b[at + 1] << 8 | b[at + 2] << 16 | uint32_t(b[at + 3]) << 24; }
uint16_t U16(const Bytes &b, size_t at) { return static_cast<uint16_t>(b[at] | b[at + 1] << 8); }
void Put32(Bytes &b, size_t at, uint32_t v) {
    for (int i = 0; i < 4; ++i) b[at + i] = static_cast<uint8_t>(v >> (8 * i));
}
void Put16(Bytes &b, size_t at, uint32_t v) {
    b[at] = static_cast<uint8_t>(v), b[at + 1] = static_cast<uint8_t>(v >> 8);
}

/// The stored line size a correct writer uses: whole pixels rounded up to 4 bytes.
int64_t PaddedStride(int bits, int w) { return (int64_t(w) * bits / 8 + 3) / 4 * 4; }

/// An 8-bit palette file made by hand. `os2`: the 12-byte header with 3-byte
/// entries. Index of pixel (x, y) (y from the bottom) = (x * 5 + y * 3) % entries.
Bytes PaletteBMP(int w, int h, bool os2, int entries, std::vector<uint8_t> &bgrPalette) {
    bgrPalette.resize(size_t(entries) * 3);
    for (int i = 0; i < entries * 3; ++i) bgrPalette[i] = static_cast<uint8_t>(i * 37 + 11);
    const int hdr = os2 ? 12 : 40, entryBytes = os2 ? 3 : 4;
    const int offset = 14 + hdr + entries * entryBytes;
    const int64_t stride = (w + 3) & ~3;
    Bytes b(size_t(offset + stride * h), 0);
    b[0] = 'B', b[1] = 'M';
    Put32(b, 2, static_cast<uint32_t>(b.size()));
    Put32(b, 10, offset);
    Put32(b, 14, hdr);
    if (os2) {
        Put16(b, 18, w), Put16(b, 20, h), Put16(b, 22, 1), Put16(b, 24, 8);
    } else {
        Put32(b, 18, w), Put32(b, 22, h), Put16(b, 26, 1), Put16(b, 28, 8);
        Put32(b, 46, entries == 256 ? 0 : entries); // colours used; 0 means all 256
    }
    for (int i = 0; i < entries; ++i)
        for (int c = 0; c < 3; ++c) b[14 + hdr + i * entryBytes + c] = bgrPalette[i * 3 + c];
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) b[offset + y * stride + x] = static_cast<uint8_t>((x * 5 + y * 3) % entries);
    return b;
}

void ExpectPalette(const Image &img, int w, int h, int entries, const std::vector<uint8_t> &pal) {
    ASSERT_EQ(img.Width(), w);
    ASSERT_EQ(img.Height(), h);
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const int i = (x * 5 + y * 3) % entries;
            const Pixel p = At(img, x, y);
            ASSERT_EQ(p.B, pal[i * 3] * 257) << x << "," << y;
            ASSERT_EQ(p.G, pal[i * 3 + 1] * 257);
            ASSERT_EQ(p.R, pal[i * 3 + 2] * 257);
            ASSERT_EQ(p.A, 65535);
        }
}

TEST_F(BMPFormatTest, RoundTripsAt24And32BitsWithExactHeaders) {
    for (auto [w, h] : {std::pair{1, 1}, {1, 6}, {2, 3}, {3, 2}, {5, 4}, {7, 3}, {33, 17}}) {
        Ref<Image> src = Image8(w, h, static_cast<unsigned>(w * 10 + h));
        for (bool alpha : {true, false}) {
            SCOPED_TRACE(std::to_string(w) + "x" + std::to_string(h) + (alpha ? " alpha" : " no alpha"));
            const Bytes b = SaveWith("BMPFormat", src.Get(), {{"SaveAlpha", alpha ? 1.0 : 0.0}});
            ASSERT_FALSE(b.empty());
            // Header fields as the format defines them.
            EXPECT_EQ(b[0], 'B');
            EXPECT_EQ(b[1], 'M');
            EXPECT_EQ(U32(b, 2), alpha ? 4u * w * h + 66 : 3u * (w * h + 18));
            EXPECT_EQ(U32(b, 10), alpha ? 66u : 54u);
            EXPECT_EQ(U32(b, 14), 40u);
            EXPECT_EQ(U32(b, 18), uint32_t(w));
            EXPECT_EQ(U32(b, 22), uint32_t(h));
            EXPECT_EQ(U16(b, 26), 1);
            EXPECT_EQ(U16(b, 28), alpha ? 32 : 24);
            EXPECT_EQ(U32(b, 30), 0u); // compression stays 0, masks or not
            EXPECT_EQ(U32(b, 34), uint32_t((alpha ? 4 : 3) * w * h));
            if (alpha) {
                EXPECT_EQ(U32(b, 54), 0xff0000u);
                EXPECT_EQ(U32(b, 58), 0xff00u);
                EXPECT_EQ(U32(b, 62), 0xffu);
            }
            const int64_t stride = alpha ? 4 * w : PaddedStride(24, w);
            EXPECT_EQ(int64_t(b.size()), (alpha ? 66 : 54) + stride * h);
            // Bytes of the first stored line: the bottom row, blue first; zero padding.
            for (int x = 0; x < w; ++x) {
                const size_t at = (alpha ? 66 : 54) + size_t(x) * (alpha ? 4 : 3);
                EXPECT_EQ(b[at], Value8(x, 0, 2, w * 10 + h));
                EXPECT_EQ(b[at + 2], Value8(x, 0, 0, w * 10 + h));
            }
            for (int64_t pad = int64_t(w) * 3; !alpha && pad < stride; ++pad) EXPECT_EQ(b[54 + pad], 0);

            Ref<ImageFormat> f = MakeFormat("BMPFormat");
            OrvaneDoc doc;
            auto *tool = Orvane::Test::AddImageSource(doc, "S", src);
            f->AddSaveInputs(tool);
            Request req(tool, nullptr, 0.0, 0, nullptr);
            req.SetInputData(tool->FindInput("SaveAlpha"), MakeRef<Number>(alpha ? 1.0 : 0.0).Get());
            f->SetupSave(tool, &req);
            EXPECT_EQ(f->PredictFileSize(src.Get()), int64_t(b.size()));

            const LoadResult r = Load("BMPFormat", b);
            ASSERT_TRUE(r.image) << r.error;
            EXPECT_EQ(r.image->Depth(), DepthRGBAInt8);
            EXPECT_EQ(r.image->DataWindow(), ImgRectI(0, 0, w, h));
            for (int y = 0; y < h; ++y)
                for (int x = 0; x < w; ++x) {
                    const Pixel a = At(*src, x, y), p = At(*r.image, x, y);
                    ASSERT_EQ(p.R, a.R) << x << "," << y;
                    ASSERT_EQ(p.G, a.G);
                    ASSERT_EQ(p.B, a.B);
                    ASSERT_EQ(p.A, alpha ? a.A : 65535);
                }
        }
    }
}

TEST_F(BMPFormatTest, DeeperImagesKeepTheTopEightBitsAndCanvasFillsOutside) {
    // 16-bit values come out as value >> 8 (no rounding).
    Ref<Image> src = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 2}, {ImgDepth, DepthRGBAInt16}});
    ASSERT_TRUE(src->AllocScanLineData());
    const uint16_t vals[4] = {0x12ff, 0x0080, 0xfffe, 0x7f01};
    for (int y = 0; y < 2; ++y)
        for (int x = 0; x < 4; ++x)
            Put(*src, x, y, Pixel{vals[x], vals[(x + 1) % 4], vals[(x + 2) % 4], vals[(x + y) % 4]});
    const LoadResult r = Load("BMPFormat", Save("BMPFormat", src.Get()));
    ASSERT_TRUE(r.image) << r.error;
    for (int y = 0; y < 2; ++y)
        for (int x = 0; x < 4; ++x) {
            const Pixel p = At(*r.image, x, y);
            EXPECT_EQ(p.R, (vals[x] >> 8) * 257);
            EXPECT_EQ(p.G, (vals[(x + 1) % 4] >> 8) * 257);
            EXPECT_EQ(p.B, (vals[(x + 2) % 4] >> 8) * 257);
            EXPECT_EQ(p.A, (vals[(x + y) % 4] >> 8) * 257);
        }
    // A data window smaller than the frame: the canvas colour outside.
    ImgRectI dw(1, 1, 3, 2);
    const FltPixel canvas{0.5f, 0.25f, 1.0f, 1.0f};
    Ref<Image> part = NewImageTagList(
        {{ImgWidth, 4}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt32}, {ImgDataWindow, &dw}, {ImgCanvasColor, &canvas}});
    ASSERT_TRUE(part->AllocScanLineData());
    part->Fill(FltPixel{0, 1, 0, 1});
    const LoadResult q = Load("BMPFormat", Save("BMPFormat", part.Get()));
    ASSERT_TRUE(q.image) << q.error;
    for (int y = 0; y < 3; ++y)
        for (int x = 0; x < 4; ++x) {
            const Pixel p = At(*q.image, x, y);
            const bool inside = dw.Contains(x, y);
            EXPECT_EQ(p.R, inside ? 0 : (FloatToU16(0.5f) >> 8) * 257) << x << "," << y;
            EXPECT_EQ(p.G, inside ? 65535 : (FloatToU16(0.25f) >> 8) * 257);
            EXPECT_EQ(p.B, inside ? 0 : 65535);
        }
}

TEST_F(BMPFormatTest, OnePixelWide24BitHasAStrideOfFour) {
    // Made by hand: 1 x 3, 24 bits, lines of 3 bytes plus one padding byte.
    Bytes b(54 + 12, 0);
    b[0] = 'B', b[1] = 'M';
    Put32(b, 10, 54), Put32(b, 14, 40), Put32(b, 18, 1), Put32(b, 22, 3), Put16(b, 26, 1), Put16(b, 28, 24);
    for (int y = 0; y < 3; ++y) {
        b[54 + 4 * y] = static_cast<uint8_t>(10 + y);
        b[55 + 4 * y] = static_cast<uint8_t>(20 + y);
        b[56 + 4 * y] = static_cast<uint8_t>(30 + y);
        b[57 + 4 * y] = 0xee; // padding, never read as a pixel
    }
    const LoadResult r = Load("BMPFormat", b);
    ASSERT_TRUE(r.image) << r.error;
    for (int y = 0; y < 3; ++y)
        EXPECT_EQ(At(*r.image, 0, y),
                  (Pixel{uint16_t((30 + y) * 257), uint16_t((20 + y) * 257), uint16_t((10 + y) * 257), 65535}));
    // And the writer uses the same stride.
    Ref<Image> one = Image8(1, 3);
    const Bytes out = SaveWith("BMPFormat", one.Get(), {{"SaveAlpha", 0}});
    EXPECT_EQ(out.size(), 54u + 12u);
}

TEST_F(BMPFormatTest, NegativeHeightMeansTopLineFirst) {
    Ref<Image> src = Image8(7, 5, 44);
    for (bool alpha : {false, true}) {
        const Bytes b = SaveWith("BMPFormat", src.Get(), {{"SaveAlpha", alpha ? 1.0 : 0.0}});
        const size_t at = U32(b, 10), stride = alpha ? 28 : PaddedStride(24, 7);
        Bytes flipped(b.begin(), b.begin() + long(at));
        Put32(flipped, 22, static_cast<uint32_t>(-5));
        for (int s = 4; s >= 0; --s)
            flipped.insert(flipped.end(), b.begin() + long(at + s * stride), b.begin() + long(at + (s + 1) * stride));
        const LoadResult full = Load("BMPFormat", flipped);
        ASSERT_TRUE(full.image) << full.error;
        EXPECT_EQ(full.image->Height(), 5);
        const LoadResult plain = Load("BMPFormat", b);
        ASSERT_TRUE(plain.image) << plain.error;
        for (int y = 0; y < 5; ++y)
            for (int x = 0; x < 7; ++x) ASSERT_EQ(At(*full.image, x, y), At(*plain.image, x, y)) << x << "," << y;
        const ImageDomain region(ImgRectI(2, 1, 6, 3));
        const LoadResult part = Load("BMPFormat", flipped, {{ClipFrameRegion, &region}});
        ASSERT_TRUE(part.image) << part.error;
        for (int y = 1; y < 3; ++y)
            for (int x = 2; x < 6; ++x) ASSERT_EQ(At(*part.image, x, y), At(*plain.image, x, y));
    }
}

TEST_F(BMPFormatTest, PalettesOfShortAndLongHeaders) {
    std::vector<uint8_t> pal;
    // The 12-byte header: width and height of 16 bits, 3-byte entries.
    for (auto [w, h] : {std::pair{5, 3}, {8, 2}, {1, 1}}) {
        const Bytes b = PaletteBMP(w, h, true, 256, pal);
        const LoadResult r = Load("BMPFormat", b);
        ASSERT_TRUE(r.image) << r.error;
        ExpectPalette(*r.image, w, h, 256, pal);
    }
    // The 40-byte header with 16 colours used: only 16 entries are read.
    const Bytes b = PaletteBMP(6, 4, false, 16, pal);
    const LoadResult r = Load("BMPFormat", b);
    ASSERT_TRUE(r.image) << r.error;
    ExpectPalette(*r.image, 6, 4, 16, pal);
    // With a zero pixel offset the pixels follow the palette directly.
    Bytes z = PaletteBMP(6, 4, true, 256, pal);
    Put32(z, 10, 0);
    const LoadResult rz = Load("BMPFormat", z);
    ASSERT_TRUE(rz.image) << rz.error;
    ExpectPalette(*rz.image, 6, 4, 256, pal);
}

TEST_F(BMPFormatTest, ReadsFilesOfNetpbmAndImageMagick) {
    if (!HaveProgram("ppmtobmp") || !HaveProgram("convert")) GTEST_SKIP() << "ppmtobmp or convert is not installed";
    TempDir dir;
    const int w = 13, h = 7;
    auto rgb = [](int x, int row) {
        return std::array<uint8_t, 3>{Value8(x, row, 0), Value8(x, row, 1), Value8(x, row, 2)};
    };
    WriteFile(dir / "in.ppm", MakePPM(w, h, rgb));
    // Few colours, for the 8-bit palette forms.
    auto few = [](int x, int row) {
        const uint8_t i = static_cast<uint8_t>((x + row * 3) % 20);
        return std::array<uint8_t, 3>{uint8_t(i * 12), uint8_t(255 - i * 9), uint8_t(i * 5 + 7)};
    };
    WriteFile(dir / "few.ppm", MakePPM(w, h, few));
    struct Case {
        const char *cmd, *file;
        bool fewColours;
    } cases[] = {
        {"ppmtobmp in.ppm > a.bmp", "a.bmp", false},
        {"ppmtobmp -os2 in.ppm > b.bmp", "b.bmp", false},
        {"ppmtobmp -bpp=8 few.ppm > c.bmp", "c.bmp", true},
        {"ppmtobmp -os2 -bpp=8 few.ppm > d.bmp", "d.bmp", true},
        {"convert in.ppm BMP3:e.bmp", "e.bmp", false},
        {"convert in.ppm -type TrueColor BMP:f.bmp", "f.bmp", false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.cmd);
        ASSERT_TRUE(RunShell("cd '" + dir.path + "' && " + c.cmd));
        const LoadResult r = Load("BMPFormat", ReadFile(dir / c.file));
        ASSERT_TRUE(r.image) << r.error;
        ASSERT_EQ(r.image->Width(), w);
        ASSERT_EQ(r.image->Height(), h);
        for (int row = 0; row < h; ++row)
            for (int x = 0; x < w; ++x) {
                const auto e = c.fewColours ? few(x, row) : rgb(x, row);
                const Pixel p = At(*r.image, x, h - 1 - row); // our rows count from the bottom
                ASSERT_EQ(p.R, e[0] * 257) << x << "," << row;
                ASSERT_EQ(p.G, e[1] * 257);
                ASSERT_EQ(p.B, e[2] * 257);
                ASSERT_EQ(p.A, 65535);
            }
    }
    // 32 bits with alpha and colour masks under a long info header: compared
    // with what ImageMagick itself reads from the file.
    ASSERT_TRUE(
        RunShell("cd '" + dir.path + "' && convert in.ppm -alpha set -channel A -fx '(i+j)/20' +channel BMP:g.bmp"));
    const Bytes g = ReadFile(dir / "g.bmp");
    ASSERT_GT(g.size(), 54u);
    EXPECT_GT(U32(g, 14), 40u) << "expected a long info header";
    EXPECT_EQ(U16(g, 28), 32);
    const LoadResult r = Load("BMPFormat", g);
    ASSERT_TRUE(r.image) << r.error;
    const Bytes ref = Capture("convert '" + (dir / "g.bmp") + "' -depth 8 rgba:-");
    ASSERT_EQ(ref.size(), size_t(w) * h * 4);
    bool someAlpha = false;
    for (int row = 0; row < h; ++row)
        for (int x = 0; x < w; ++x) {
            const uint8_t *e = &ref[(size_t(row) * w + x) * 4];
            const Pixel p = At(*r.image, x, h - 1 - row);
            ASSERT_EQ(p.R, e[0] * 257) << x << "," << row;
            ASSERT_EQ(p.G, e[1] * 257);
            ASSERT_EQ(p.B, e[2] * 257);
            ASSERT_EQ(p.A, e[3] * 257);
            someAlpha |= e[3] != 255;
        }
    EXPECT_TRUE(someAlpha);
}

TEST_F(BMPFormatTest, OurFilesReadByNetpbmAndImageMagick) {
    if (!HaveProgram("bmptopnm") || !HaveProgram("convert")) GTEST_SKIP() << "bmptopnm or convert is not installed";
    TempDir dir;
    for (int w : {1, 2, 3, 10}) {
        const int h = 5;
        Ref<Image> src = Image8(w, h, 7u + w);
        for (bool alpha : {false, true}) {
            SCOPED_TRACE(std::to_string(w) + (alpha ? " alpha" : ""));
            const std::string path = dir / "ours.bmp";
            WriteFile(path, SaveWith("BMPFormat", src.Get(), {{"SaveAlpha", alpha ? 1.0 : 0.0}}));
            int pw = 0, ph = 0;
            Bytes rgb;
            ASSERT_TRUE(ParsePPM(Capture("bmptopnm '" + path + "'"), pw, ph, rgb));
            ASSERT_EQ(pw, w);
            ASSERT_EQ(ph, h);
            const Bytes im = Capture("convert '" + path + "' -depth 8 rgb:-");
            ASSERT_EQ(im.size(), size_t(w) * h * 3);
            for (int row = 0; row < h; ++row)
                for (int x = 0; x < w; ++x)
                    for (int c = 0; c < 3; ++c) {
                        const uint8_t e = Value8(x, h - 1 - row, c, 7u + w);
                        ASSERT_EQ(rgb[(size_t(row) * w + x) * 3 + c], e) << x << "," << row << " netpbm";
                        ASSERT_EQ(im[(size_t(row) * w + x) * 3 + c], e) << x << "," << row << " ImageMagick";
                    }
        }
    }
}

TEST_F(BMPFormatTest, RegionReadEqualsTheCropOfAFullRead) {
    Ref<Image> src = Image8(23, 11, 3);
    for (bool alpha : {false, true}) {
        const Bytes b = SaveWith("BMPFormat", src.Get(), {{"SaveAlpha", alpha ? 1.0 : 0.0}});
        const LoadResult full = Load("BMPFormat", b);
        ASSERT_TRUE(full.image) << full.error;
        for (ImgRectI rect : {ImgRectI(0, 0, 23, 11), ImgRectI(3, 2, 9, 7), ImgRectI(22, 10, 23, 11),
                              ImgRectI(-5, -5, 4, 3), ImgRectI(20, 8, 40, 40)}) {
            const ImageDomain region(rect);
            const LoadResult r = Load("BMPFormat", b, {{ClipFrameRegion, &region}});
            ASSERT_TRUE(r.image) << r.error;
            const ImgRectI expect = rect & ImgRectI(0, 0, 23, 11);
            ASSERT_EQ(r.image->DataWindow(), expect);
            for (int y = expect.y0; y < expect.y1; ++y)
                for (int x = expect.x0; x < expect.x1; ++x) ASSERT_EQ(At(*r.image, x, y), At(*full.image, x, y));
        }
        // A region outside the frame gives an empty window and no failure.
        const ImageDomain outside(ImgRectI(40, 40, 50, 50));
        const LoadResult none = Load("BMPFormat", b, {{ClipFrameRegion, &outside}});
        ASSERT_TRUE(none.image) << none.error;
        EXPECT_TRUE(none.image->DataWindow().IsNull());
    }
}

TEST_F(BMPFormatTest, HeaderOnlyAbortAndCheck) {
    Ref<Image> src = Image8(9, 4);
    const Bytes b = Save("BMPFormat", src.Get());
    const LoadResult pre = Load("BMPFormat", b, {{ClipFrameHeaderOnly, 1}});
    ASSERT_TRUE(pre.image) << pre.error;
    EXPECT_TRUE(pre.image->IsNoData());
    EXPECT_FALSE(pre.image->HasScanLineData());
    EXPECT_EQ(pre.image->Width(), 9);

    std::atomic<bool> abort{true};
    const LoadResult stopped = Load("BMPFormat", b, {}, [&](ImageFormat &f) { f.abortFlag = &abort; });
    EXPECT_TRUE(stopped.headerOk);
    EXPECT_FALSE(stopped.image);
    EXPECT_NE(stopped.error.find("abort"), std::string::npos) << stopped.error;

    Ref<ImageFormat> f = MakeFormat("BMPFormat");
    MemoryIO good(b), bad(Bytes{'B', 'N', 0, 0}), tiny(Bytes{'B'});
    EXPECT_TRUE(f->CheckFormat(&good));
    EXPECT_FALSE(f->CheckFormat(&bad));
    EXPECT_FALSE(f->CheckFormat(&tiny));
}

TEST_F(BMPFormatTest, OptionsAreAddedWithTheirDefaults) {
    OrvaneDoc doc;
    auto *tool = Orvane::Test::AddImageSource(doc, "S", Image8(2, 2));
    Ref<ImageFormat> f = MakeFormat("BMPFormat");
    f->AddSaveInputs(tool);
    Input *in = tool->FindInput("SaveAlpha");
    ASSERT_NE(in, nullptr);
    EXPECT_EQ(in->Name(), "Save Alpha");
    EXPECT_EQ(in->Tags().GetID(InputControl), CLSID_InputControl_Checkbox);
    EXPECT_EQ(in->Tags().GetLong(InputExternal, 1), 0);
    // Untouched, the default (alpha on) holds: a 32-bit file.
    Request req(tool, nullptr, 0.0, 0, nullptr);
    f->SetupSave(tool, &req);
    MemoryIO io;
    Ref<Image> img = Image8(2, 2);
    ASSERT_TRUE(f->SaveHeader(&io, img.Get()) && f->SaveFrame(0, img.Get()));
    EXPECT_EQ(U16(io.Data(), 28), 32);
    // No tool at all: the defaults too.
    const Bytes plain = Save("BMPFormat", img.Get());
    EXPECT_EQ(U16(plain, 28), 32);
}

TEST_F(BMPFormatTest, RefusedAndDamagedFilesFailCleanly) {
    Ref<Image> src = Image8(6, 5);
    std::vector<uint8_t> pal;
    for (const Bytes &good : {Save("BMPFormat", src.Get()), SaveWith("BMPFormat", src.Get(), {{"SaveAlpha", 0}}),
                              PaletteBMP(7, 3, true, 256, pal), PaletteBMP(7, 3, false, 16, pal)}) {
        ASSERT_TRUE(Load("BMPFormat", good).image);
        // Every cut short of the whole file fails, with a reason.
        for (size_t cut = 0; cut < good.size(); ++cut) {
            const LoadResult r = Load("BMPFormat", Bytes(good.begin(), good.begin() + static_cast<long>(cut)));
            ASSERT_FALSE(r.image) << "cut at " << cut;
        }
        // Any header byte flipped: the read either fails or gives an image of the header's size.
        for (size_t at = 0; at < 54; ++at)
            for (uint8_t mask : {uint8_t(0xff), uint8_t(0x80), uint8_t(0x01)}) {
                Bytes bad = good;
                bad[at] ^= mask;
                const LoadResult r = Load("BMPFormat", bad);
                if (r.image) {
                    EXPECT_GT(r.image->Width(), 0);
                    EXPECT_GT(r.image->Height(), 0);
                }
            }
    }
    Bytes b = Save("BMPFormat", src.Get());
    auto refused = [&](size_t at, int bytes, uint32_t value) {
        Bytes bad = b;
        bytes == 2 ? Put16(bad, at, value) : Put32(bad, at, value);
        const LoadResult r = Load("BMPFormat", bad);
        EXPECT_FALSE(r.headerOk) << at << " = " << value;
    };
    refused(0, 2, 0x4d42 + 1); // magic
    for (uint32_t bits : {1u, 4u, 16u, 0u, 64u}) refused(28, 2, bits);
    for (uint32_t comp : {1u, 2u, 4u, 5u}) refused(30, 4, comp);
    refused(18, 4, 0);           // width 0
    refused(22, 4, 0);           // height 0
    refused(18, 4, 0x7fffffffu); // absurd width
    refused(22, 4, 0x80000000u); // negative height
    refused(10, 4, 0x7ffffff0u); // pixel offset past the end
}

// The three rows as the host sees them, and the host's format list choosing
// each format by extension and, for a misnamed file, by content.
TEST_F(BMPFormatTest, RegistryRowsAndTheFormatList) {
    struct Row {
        const char *id, *name;
        std::vector<std::string> extensions;
        bool options, lossless, domain;
    } rows[] = {{"BMPFormat", "Windows Bitmap Files", {".BMP", ".DIB"}, true, false, false},
                {"TargaFormat", "Targa Files", {".tga"}, true, true, false},
                {"RawFormat", "Orvane Raw Image Files", {".raw"}, false, false, true}};
    for (const Row &row : rows) {
        SCOPED_TRACE(row.id);
        const Registry *r = ClassRegistry->Find(OvID(row.id), RegFamilyImageFormat);
        ASSERT_NE(r, nullptr);
        const TagList &t = r->Tags();
        EXPECT_EQ(t.GetLong(RegTypeFlags) & RegFamilyMask, RegFamilyImageFormat);
        EXPECT_STREQ(t.GetText(RegFormatName, ""), row.name);
        std::vector<std::string> ext;
        for (const TagItem *e : t.FindAll(RegFormatExtension)) ext.push_back(e->AsText());
        EXPECT_EQ(ext, row.extensions);
        EXPECT_TRUE(t.GetBool(RegFormatCanLoad));
        EXPECT_TRUE(t.GetBool(RegFormatCanSave));
        EXPECT_TRUE(t.GetBool(RegFormatKeepsAspect));
        EXPECT_EQ(t.GetBool(RegFormatHasOptions), row.options);
        EXPECT_EQ(t.GetBool(RegFormatHasSaveOptions), row.options);
        EXPECT_EQ(t.GetBool(RegFormatLosslessOnly), row.lossless);
        EXPECT_EQ(t.GetBool(RegFormatHasDomain), row.domain);
        EXPECT_EQ(t.GetLong(RegSortOrder), row.domain ? 1000000 : 0);
    }
    Ref<Image> img = Image8(4, 3);
    const Bytes files[3] = {Save("BMPFormat", img.Get()), Save("TargaFormat", img.Get()), Save("RawFormat", img.Get())};
    const char *ids[3] = {"BMPFormat", "TargaFormat", "RawFormat"};
    const char *names[3] = {"a.bmp", "b.TGA", "c.raw"};
    for (int i = 0; i < 3; ++i) {
        std::string error;
        MemoryIO io(files[i]);
        Ref<ImageFormat> f = FindFormatForReading(names[i], &io, error);
        ASSERT_TRUE(f) << error;
        EXPECT_EQ(f->GetRegistry()->ID(), OvID(ids[i]));
        // Misnamed: found by content.
        MemoryIO again(files[i]);
        Ref<ImageFormat> g = FindFormatForReading("misnamed.dat", &again, error);
        ASSERT_TRUE(g) << error;
        EXPECT_EQ(g->GetRegistry()->ID(), OvID(ids[i]));
        Ref<ImageFormat> w = FindFormatForWriting(std::string("out") + names[i], error);
        ASSERT_TRUE(w) << error;
        EXPECT_EQ(w->GetRegistry()->ID(), OvID(ids[i]));
        // And the format found reads the file.
        ASSERT_TRUE(g->LoadHeader(&again)) << g->Error();
        Ref<Image> back;
        ASSERT_TRUE(g->LoadFrameTagList(0, back, {})) << g->Error();
        EXPECT_EQ(At(*back, 3, 2), At(*img, 3, 2));
    }
}

// Writers report a short write (a full disk) and an abort as failures, at
// any point of the file.
TEST_F(BMPFormatTest, WritersFailOnShortWritesAndAbort) {
    Ref<Image> img = Rich8ForWrite();
    for (const char *id : {"BMPFormat", "TargaFormat", "RawFormat"}) {
        SCOPED_TRACE(id);
        const Bytes whole = Save(id, img.Get());
        ASSERT_FALSE(whole.empty());
        for (int64_t limit : {int64_t(0), int64_t(10), int64_t(17), int64_t(54), int64_t(700),
                              int64_t(whole.size()) / 2, int64_t(whole.size()) - 1}) {
            Ref<ImageFormat> f = MakeFormat(id);
            f->SetupSave(nullptr, nullptr);
            LimitedIO io(limit);
            const bool ok = f->SaveHeader(&io, img.Get()) && f->SaveFrame(0, img.Get());
            EXPECT_FALSE(ok) << "limit " << limit;
            EXPECT_FALSE(f->Error().empty());
        }
        std::atomic<bool> abort{true};
        Ref<ImageFormat> f = MakeFormat(id);
        f->SetupSave(nullptr, nullptr);
        f->abortFlag = &abort;
        MemoryIO io;
        ASSERT_TRUE(f->SaveHeader(&io, img.Get())) << f->Error();
        EXPECT_FALSE(f->SaveFrame(0, img.Get()));
        EXPECT_NE(f->Error().find("abort"), std::string::npos) << f->Error();
    }
    // Targa sides are 16 bits.
    Ref<Image> wide = NewImageTagList({{ImgWidth, 65536}, {ImgHeight, 1}, {ImgDepth, DepthRGBAInt8}});
    Ref<ImageFormat> t = MakeFormat("TargaFormat");
    t->SetupSave(nullptr, nullptr);
    MemoryIO io;
    EXPECT_FALSE(t->SaveHeader(&io, wide.Get()));
    EXPECT_FALSE(t->Error().empty());
}

// The same through files on disk: writing seeks back (Raw's size field) and
// reading asks the file's size.
TEST_F(BMPFormatTest, FilesOnDiskReadBackForEveryFormat) {
    TempDir dir;
    Ref<Image> img = Image8(131, 6, 12);
    for (const char *id : {"BMPFormat", "TargaFormat", "RawFormat"}) {
        SCOPED_TRACE(id);
        const std::string path = dir / (std::string(id) + ".img");
        std::string error;
        {
            auto out = FileIO::Open(path, FileIO::Mode::Write, error);
            ASSERT_NE(out, nullptr) << error;
            Ref<ImageFormat> f = MakeFormat(id);
            f->SetupSave(nullptr, nullptr);
            ASSERT_TRUE(f->SaveHeader(out.get(), img.Get()) && f->SaveFrame(0, img.Get())) << f->Error();
            ASSERT_TRUE(out->Close());
        }
        EXPECT_EQ(ReadFile(path), Save(id, img.Get())) << "the file holds what memory holds";
        auto in = FileIO::Open(path, FileIO::Mode::Read, error);
        ASSERT_NE(in, nullptr) << error;
        Ref<ImageFormat> f = MakeFormat(id);
        ASSERT_TRUE(f->LoadHeader(in.get())) << f->Error();
        Ref<Image> back;
        ASSERT_TRUE(f->LoadFrameTagList(0, back, {})) << f->Error();
        for (int y = 0; y < 6; ++y)
            for (int x = 0; x < 131; ++x) ASSERT_EQ(At(*back, x, y), At(*img, x, y)) << x << "," << y;
    }
}

} // namespace bmp_format_test
} // namespace Orvane
