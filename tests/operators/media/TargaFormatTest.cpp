// TargaFormat: round trips at 24 and 32 bits, run-length coded and plain;
// the packet rule; files made by netpbm and ImageMagick and ours read by
// them; top-origin, mirrored, colour-mapped and grey files; proxy scale;
// region reads; the abort word; options; damaged files.
#include <cstring>

#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace tga_format_test {

using namespace Orvane::FmtTest;

class TargaFormatTest : public FormatSuite {};

uint16_t U16(const Bytes &b, size_t at) { return static_cast<uint16_t>(b[at] | b[at + 1] << 8); }

/// An 18-byte header.
Bytes Header(int type, int w, int h, int bits, int descriptor, int idLength = 0, int mapType = 0, int mapFirst = 0,
             int mapLength = 0, int mapBits = 0) {
    Bytes b(18, 0);
    b[0] = static_cast<uint8_t>(idLength), b[1] = static_cast<uint8_t>(mapType), b[2] = static_cast<uint8_t>(type);
    b[3] = static_cast<uint8_t>(mapFirst), b[4] = static_cast<uint8_t>(mapFirst >> 8);
    b[5] = static_cast<uint8_t>(mapLength), b[6] = static_cast<uint8_t>(mapLength >> 8);
    b[7] = static_cast<uint8_t>(mapBits);
    b[12] = static_cast<uint8_t>(w), b[13] = static_cast<uint8_t>(w >> 8);
    b[14] = static_cast<uint8_t>(h), b[15] = static_cast<uint8_t>(h >> 8);
    b[16] = static_cast<uint8_t>(bits), b[17] = static_cast<uint8_t>(descriptor);
    return b;
}

/// Decodes run-length packets independently: pixel bytes in order, and
/// whether a packet crossed the end of a line of `w` pixels.
Bytes Unpack(const Bytes &b, size_t from, int w, int h, int bpp, bool &crossed, int &packets) {
    Bytes out;
    crossed = false, packets = 0;
    size_t pos = from;
    const size_t total = size_t(w) * h;
    while (out.size() / bpp < total && pos < b.size()) {
        const int c = b[pos++];
        const int n = (c & 0x7f) + 1;
        const size_t before = out.size() / bpp;
        if ((before % w) + n > size_t(w)) crossed = true;
        ++packets;
        if (c & 0x80) {
            for (int k = 0; k < n; ++k) out.insert(out.end(), b.begin() + long(pos), b.begin() + long(pos + bpp));
            pos += bpp;
        } else {
            out.insert(out.end(), b.begin() + long(pos), b.begin() + long(pos + size_t(n) * bpp));
            pos += size_t(n) * bpp;
        }
    }
    EXPECT_EQ(pos, b.size()) << "packets end with the file";
    return out;
}

void ExpectSame(const Image &src, const Image &got, bool alpha) {
    ASSERT_EQ(got.Width(), src.Width());
    ASSERT_EQ(got.Height(), src.Height());
    for (int y = 0; y < src.Height(); ++y)
        for (int x = 0; x < src.Width(); ++x) {
            const Pixel a = At(src, x, y), p = At(got, x, y);
            ASSERT_EQ(p.R, a.R) << x << "," << y;
            ASSERT_EQ(p.G, a.G) << x << "," << y;
            ASSERT_EQ(p.B, a.B) << x << "," << y;
            ASSERT_EQ(p.A, alpha ? a.A : 65535) << x << "," << y;
        }
}

TEST_F(TargaFormatTest, RoundTripsAt24And32BitsPlainAndCompressed) {
    for (auto [w, h] : {std::pair{1, 1}, {1, 5}, {3, 2}, {17, 9}, {130, 3}, {300, 4}}) {
        Ref<Image> src = Image8(w, h, static_cast<unsigned>(w + 100 * h));
        for (bool alpha : {true, false})
            for (bool compress : {true, false}) {
                SCOPED_TRACE(std::to_string(w) + "x" + std::to_string(h) + (alpha ? " alpha" : "") +
                             (compress ? " rle" : " plain"));
                const Bytes b = SaveWith("TargaFormat", src.Get(),
                                         {{"SaveAlpha", alpha ? 1.0 : 0.0}, {"Compress", compress ? 1.0 : 0.0}});
                ASSERT_GE(b.size(), 18u);
                EXPECT_EQ(b[0], 0);
                EXPECT_EQ(b[1], 0);
                EXPECT_EQ(b[2], compress ? 10 : 2);
                EXPECT_EQ(U16(b, 12), w);
                EXPECT_EQ(U16(b, 14), h);
                EXPECT_EQ(b[16], alpha ? 32 : 24);
                EXPECT_EQ(b[17], alpha ? 8 : 0);
                const int bpp = alpha ? 4 : 3;
                Bytes pixels;
                if (compress) {
                    bool crossed;
                    int packets;
                    pixels = Unpack(b, 18, w, h, bpp, crossed, packets);
                    EXPECT_FALSE(crossed) << "a packet ran over a line end";
                } else {
                    EXPECT_EQ(b.size(), 18u + size_t(w) * h * bpp);
                    pixels.assign(b.begin() + 18, b.end());
                }
                // Bottom line first, blue green red alpha.
                ASSERT_EQ(pixels.size(), size_t(w) * h * bpp);
                for (int y = 0; y < h; ++y)
                    for (int x = 0; x < w; ++x) {
                        const uint8_t *p = &pixels[(size_t(y) * w + x) * bpp];
                        const unsigned seed = static_cast<unsigned>(w + 100 * h);
                        ASSERT_EQ(p[0], Value8(x, y, 2, seed));
                        ASSERT_EQ(p[1], Value8(x, y, 1, seed));
                        ASSERT_EQ(p[2], Value8(x, y, 0, seed));
                        if (alpha) {
                            ASSERT_EQ(p[3], Value8(x, y, 3, seed));
                        }
                    }
                const LoadResult r = Load("TargaFormat", b);
                ASSERT_TRUE(r.image) << r.error;
                ExpectSame(*src, *r.image, alpha);
            }
    }
}

TEST_F(TargaFormatTest, PacketsFollowTheRule) {
    // One line of 300 equal pixels: runs of 128, 128 and 44.
    Ref<Image> flat = NewImageTagList({{ImgWidth, 300}, {ImgHeight, 2}, {ImgDepth, DepthRGBAInt8}});
    ASSERT_TRUE(flat->AllocScanLineData());
    flat->Fill(FltPixel{1, 0, 0, 1});
    const Bytes b = SaveWith("TargaFormat", flat.Get(), {{"SaveAlpha", 0}});
    const Bytes line = {0xff, 0, 0, 255, 0xff, 0, 0, 255, 0x80 + 43, 0, 0, 255};
    Bytes expect(b.begin(), b.begin() + 18);
    expect.insert(expect.end(), line.begin(), line.end());
    expect.insert(expect.end(), line.begin(), line.end()); // no packet spans the two lines
    EXPECT_EQ(b, expect);

    // Two equal neighbours start a run; literals stop before one and at 128.
    Ref<Image> mix = NewImageTagList({{ImgWidth, 6}, {ImgHeight, 1}, {ImgDepth, DepthRGBAInt8}});
    ASSERT_TRUE(mix->AllocScanLineData());
    const uint16_t v[6] = {1, 2, 3, 3, 3, 4};
    for (int x = 0; x < 6; ++x) Put(*mix, x, 0, Pixel{uint16_t(v[x] * 257), 0, 0, 65535});
    const Bytes m = SaveWith("TargaFormat", mix.Get(), {{"SaveAlpha", 0}});
    const Bytes mexpect = {0x01, 0, 0, 1, 0, 0, 2, 0x82, 0, 0, 3, 0x00, 0, 0, 4};
    EXPECT_EQ(Bytes(m.begin() + 18, m.end()), mexpect);

    // 200 different pixels: a literal of 128, then one of 72.
    Ref<Image> ramp = NewImageTagList({{ImgWidth, 200}, {ImgHeight, 1}, {ImgDepth, DepthRGBAInt8}});
    ASSERT_TRUE(ramp->AllocScanLineData());
    for (int x = 0; x < 200; ++x) Put(*ramp, x, 0, Pixel{uint16_t(x * 257), 0, 0, 65535});
    const Bytes r = SaveWith("TargaFormat", ramp.Get(), {{"SaveAlpha", 0}});
    ASSERT_EQ(r.size(), 18u + 1 + 128 * 3 + 1 + 72 * 3);
    EXPECT_EQ(r[18], 127);
    EXPECT_EQ(r[18 + 1 + 128 * 3], 71);
}

TEST_F(TargaFormatTest, ReadsFilesOfNetpbmAndImageMagick) {
    if (!HaveProgram("ppmtotga") || !HaveProgram("convert")) GTEST_SKIP() << "ppmtotga or convert is not installed";
    TempDir dir;
    const int w = 11, h = 6;
    auto rgb = [](int x, int row) {
        return std::array<uint8_t, 3>{Value8(x, row, 0), Value8(x, row, 1), Value8(x, row, 2)};
    };
    auto few = [](int x, int row) {
        const uint8_t i = static_cast<uint8_t>((x / 2 + row) % 9);
        return std::array<uint8_t, 3>{uint8_t(i * 20), uint8_t(200 - i * 11), uint8_t(i * 3)};
    };
    auto grey = [](int x, int row) {
        const uint8_t g = static_cast<uint8_t>(x * 20 + row * 3 + (x % 3 == 0 ? 0 : 1));
        return std::array<uint8_t, 3>{g, g, g};
    };
    WriteFile(dir / "in.ppm", MakePPM(w, h, rgb));
    WriteFile(dir / "few.ppm", MakePPM(w, h, few));
    WriteFile(dir / "grey.ppm", MakePPM(w, h, grey));
    struct Case {
        const char *cmd, *file;
        int which; // 0 rgb, 1 few colours, 2 grey
    } cases[] = {
        {"ppmtotga -rgb -norle in.ppm > a.tga", "a.tga", 0},
        {"ppmtotga -rgb in.ppm > b.tga", "b.tga", 0},
        {"ppmtotga -cmap -norle few.ppm > c.tga", "c.tga", 1},
        {"ppmtotga -cmap few.ppm > d.tga", "d.tga", 1},
        {"ppmtotga -mono -norle grey.ppm > e.tga", "e.tga", 2},
        {"ppmtotga -mono grey.ppm > f.tga", "f.tga", 2},
        // ImageMagick's files are compared with what tgatoppm reads from them
        // (this ImageMagick stores its rows top first under a bottom-origin header).
        {"convert in.ppm -compress None TGA:g.tga", "g.tga", 3},
        {"convert in.ppm -compress RLE TGA:h.tga", "h.tga", 3},
        {"convert few.ppm -type Palette -compress None TGA:i.tga", "i.tga", 3},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.cmd);
        ASSERT_TRUE(RunShell("cd '" + dir.path + "' && " + c.cmd));
        const LoadResult r = Load("TargaFormat", ReadFile(dir / c.file));
        ASSERT_TRUE(r.image) << r.error;
        ASSERT_EQ(r.image->Width(), w);
        ASSERT_EQ(r.image->Height(), h);
        int pw = 0, ph = 0;
        Bytes ref;
        if (c.which == 3) {
            if (!HaveProgram("tgatoppm")) GTEST_SKIP() << "tgatoppm is not installed";
            ASSERT_TRUE(ParsePPM(Capture("tgatoppm '" + (dir / c.file) + "'"), pw, ph, ref));
            ASSERT_EQ(pw, w);
            ASSERT_EQ(ph, h);
        }
        for (int row = 0; row < h; ++row)
            for (int x = 0; x < w; ++x) {
                const size_t at = (size_t(row) * w + x) * 3;
                const auto e = c.which == 0   ? rgb(x, row)
                               : c.which == 1 ? few(x, row)
                               : c.which == 2 ? grey(x, row)
                                              : std::array<uint8_t, 3>{ref[at], ref[at + 1], ref[at + 2]};
                const Pixel p = At(*r.image, x, h - 1 - row);
                ASSERT_EQ(p.R, e[0] * 257) << x << "," << row;
                ASSERT_EQ(p.G, e[1] * 257) << x << "," << row;
                ASSERT_EQ(p.B, e[2] * 257) << x << "," << row;
                ASSERT_EQ(p.A, 65535);
            }
    }
}

TEST_F(TargaFormatTest, OurFilesReadByNetpbmAndImageMagick) {
    if (!HaveProgram("tgatoppm") || !HaveProgram("convert")) GTEST_SKIP() << "tgatoppm or convert is not installed";
    TempDir dir;
    const int w = 140, h = 4; // lines longer than one packet
    Ref<Image> src = Image8(w, h, 5);
    for (bool alpha : {false, true})
        for (bool compress : {false, true}) {
            SCOPED_TRACE(std::string(alpha ? "alpha " : "") + (compress ? "rle" : "plain"));
            const std::string path = dir / "ours.tga";
            WriteFile(path, SaveWith("TargaFormat", src.Get(),
                                     {{"SaveAlpha", alpha ? 1.0 : 0.0}, {"Compress", compress ? 1.0 : 0.0}}));
            int pw = 0, ph = 0;
            Bytes rgb;
            ASSERT_TRUE(ParsePPM(Capture("tgatoppm '" + path + "'"), pw, ph, rgb));
            ASSERT_EQ(pw, w);
            ASSERT_EQ(ph, h);
            const Bytes im = Capture("convert '" + path + "' -auto-orient -depth 8 rgba:-");
            ASSERT_EQ(im.size(), size_t(w) * h * 4);
            for (int row = 0; row < h; ++row)
                for (int x = 0; x < w; ++x) {
                    for (int c = 0; c < 3; ++c) {
                        const uint8_t e = Value8(x, h - 1 - row, c, 5);
                        ASSERT_EQ(rgb[(size_t(row) * w + x) * 3 + c], e) << x << "," << row << " netpbm";
                        ASSERT_EQ(im[(size_t(row) * w + x) * 4 + c], e) << x << "," << row << " ImageMagick";
                    }
                    const uint8_t a = alpha ? Value8(x, h - 1 - row, 3, 5) : 255;
                    ASSERT_EQ(im[(size_t(row) * w + x) * 4 + 3], a) << x << "," << row << " alpha";
                }
        }
}

TEST_F(TargaFormatTest, OriginsMapsGreyAndSixteenBitFiles) {
    const int w = 3, h = 2;
    // Top-origin, right-to-left, 24 bits: stored rows top first, columns from the right.
    Bytes top = Header(2, w, h, 24, 0x20 | 0x10);
    for (int s = 0; s < h; ++s)
        for (int k = 0; k < w; ++k) top.insert(top.end(), {uint8_t(s * 10 + k), 0, 0});
    LoadResult r = Load("TargaFormat", top);
    ASSERT_TRUE(r.image) << r.error;
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const int s = h - 1 - y, k = w - 1 - x;
            EXPECT_EQ(At(*r.image, x, y).B, (s * 10 + k) * 257) << x << "," << y;
        }
    // The same as a run-length file whose packet runs on into the next line.
    Bytes topRle = Header(10, w, h, 24, 0x20);
    topRle.insert(topRle.end(), {0x83, 7, 8, 9, 0x01, 1, 2, 3, 4, 5, 6});
    r = Load("TargaFormat", topRle);
    ASSERT_TRUE(r.image) << r.error;
    const Pixel seven{9 * 257, 8 * 257, 7 * 257, 65535};
    EXPECT_EQ(At(*r.image, 0, 1), seven);
    EXPECT_EQ(At(*r.image, 2, 1), seven);
    EXPECT_EQ(At(*r.image, 0, 0), seven); // the run's fourth pixel starts the second stored line
    EXPECT_EQ(At(*r.image, 1, 0), (Pixel{3 * 257, 2 * 257, 1 * 257, 65535}));
    EXPECT_EQ(At(*r.image, 2, 0), (Pixel{6 * 257, 5 * 257, 4 * 257, 65535}));

    // Colour map of 24-bit entries starting at index 2, after an ID of 5 bytes.
    Bytes mapped = Header(1, 2, 1, 8, 0, 5, 1, 2, 3, 24);
    mapped.insert(mapped.end(), {'i', 'd', 'e', 'n', 't'});
    mapped.insert(mapped.end(), {10, 20, 30, 40, 50, 60, 70, 80, 90}); // entries 2, 3, 4 (BGR)
    mapped.insert(mapped.end(), {4, 2});
    r = Load("TargaFormat", mapped);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(At(*r.image, 0, 0), (Pixel{90 * 257, 80 * 257, 70 * 257, 65535}));
    EXPECT_EQ(At(*r.image, 1, 0), (Pixel{30 * 257, 20 * 257, 10 * 257, 65535}));

    // 32-bit map entries keep alpha when the descriptor says so.
    Bytes map32 = Header(1, 1, 1, 8, 8, 0, 1, 0, 1, 32);
    map32.insert(map32.end(), {1, 2, 3, 4, 0});
    r = Load("TargaFormat", map32);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(At(*r.image, 0, 0), (Pixel{3 * 257, 2 * 257, 1 * 257, 4 * 257}));

    // 16 bits, 5-5-5 with an alpha bit.
    Bytes sixteen = Header(2, 2, 1, 16, 1);
    const uint16_t a = 0x8000 | (31 << 10) | (1 << 5) | 16, b = (0 << 10) | (31 << 5) | 0;
    sixteen.insert(sixteen.end(), {uint8_t(a), uint8_t(a >> 8), uint8_t(b), uint8_t(b >> 8)});
    r = Load("TargaFormat", sixteen);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(At(*r.image, 0, 0), (Pixel{255 * 257, 8 * 257, 132 * 257, 65535}));
    EXPECT_EQ(At(*r.image, 1, 0), (Pixel{0, 255 * 257, 0, 0}));

    // Grey, run-length.
    Bytes grey = Header(11, 4, 1, 8, 0);
    grey.insert(grey.end(), {0x81, 50, 0x01, 7, 9});
    r = Load("TargaFormat", grey);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(At(*r.image, 1, 0), (Pixel{50 * 257, 50 * 257, 50 * 257, 65535}));
    EXPECT_EQ(At(*r.image, 3, 0), (Pixel{9 * 257, 9 * 257, 9 * 257, 65535}));
}

TEST_F(TargaFormatTest, ProxyScaleOnPlainFilesOnly) {
    Ref<Image> src = Image8(9, 7, 11);
    const Bytes plain = SaveWith("TargaFormat", src.Get(), {{"Compress", 0}});
    const Bytes rle = Save("TargaFormat", src.Get());
    ASSERT_EQ(rle[2], 10);
    for (int scale : {2, 3}) {
        const LoadResult r = Load("TargaFormat", plain, {}, [&](ImageFormat &f) { f.proxyScale = scale; });
        ASSERT_TRUE(r.image) << r.error;
        EXPECT_EQ(r.image->Width(), 9 / scale);
        EXPECT_EQ(r.image->Height(), 7 / scale);
        EXPECT_EQ(r.image->GetAttrL(ImgFullWidth), 9);
        EXPECT_EQ(r.image->GetAttrL(ImgFullHeight), 7);
        for (int y = 0; y < 7 / scale; ++y)
            for (int x = 0; x < 9 / scale; ++x) ASSERT_EQ(At(*r.image, x, y), At(*src, x * scale, y * scale));
        // Image type 10 ignores the proxy scale.
        const LoadResult q = Load("TargaFormat", rle, {}, [&](ImageFormat &f) { f.proxyScale = scale; });
        ASSERT_TRUE(q.image) << q.error;
        ExpectSame(*src, *q.image, true);
    }
}

TEST_F(TargaFormatTest, RegionReadEqualsTheCropOfAFullRead) {
    Ref<Image> src = Image8(150, 9, 4);
    for (bool compress : {false, true}) {
        const Bytes b = SaveWith("TargaFormat", src.Get(), {{"Compress", compress ? 1.0 : 0.0}});
        const LoadResult full = Load("TargaFormat", b);
        ASSERT_TRUE(full.image) << full.error;
        ExpectSame(*src, *full.image, true);
        for (ImgRectI rect :
             {ImgRectI(0, 0, 150, 9), ImgRectI(5, 2, 140, 6), ImgRectI(149, 8, 150, 9), ImgRectI(-3, -3, 2, 2)}) {
            const ImageDomain region(rect);
            const LoadResult r = Load("TargaFormat", b, {{ClipFrameRegion, &region}});
            ASSERT_TRUE(r.image) << r.error;
            const ImgRectI expect = rect & ImgRectI(0, 0, 150, 9);
            ASSERT_EQ(r.image->DataWindow(), expect);
            for (int y = expect.y0; y < expect.y1; ++y)
                for (int x = expect.x0; x < expect.x1; ++x) ASSERT_EQ(At(*r.image, x, y), At(*full.image, x, y));
        }
    }
    // Top-origin files too (made by hand from a bottom-origin plain file).
    Bytes b = SaveWith("TargaFormat", src.Get(), {{"Compress", 0}});
    Bytes flipped(b.begin(), b.begin() + 18);
    flipped[17] |= 0x20;
    const size_t line = 150 * 4;
    for (int s = 0; s < 9; ++s) {
        const auto at = b.begin() + long(18 + (8 - s) * line);
        flipped.insert(flipped.end(), at, at + long(line));
    }
    const ImageDomain region(ImgRectI(10, 1, 20, 4));
    const LoadResult r = Load("TargaFormat", flipped, {{ClipFrameRegion, &region}});
    ASSERT_TRUE(r.image) << r.error;
    for (int y = 1; y < 4; ++y)
        for (int x = 10; x < 20; ++x) ASSERT_EQ(At(*r.image, x, y), At(*src, x, y));
}

TEST_F(TargaFormatTest, HeaderOnlyAbortOptionsAndCheck) {
    Ref<Image> src = Image8(5, 5);
    const Bytes b = Save("TargaFormat", src.Get());
    const LoadResult pre = Load("TargaFormat", b, {{ClipFrameHeaderOnly, 1}});
    ASSERT_TRUE(pre.image) << pre.error;
    EXPECT_TRUE(pre.image->IsNoData());

    std::atomic<bool> abort{true};
    for (const Bytes &file : {b, SaveWith("TargaFormat", src.Get(), {{"Compress", 0}})}) {
        const LoadResult stopped = Load("TargaFormat", file, {}, [&](ImageFormat &f) { f.abortFlag = &abort; });
        EXPECT_TRUE(stopped.headerOk);
        EXPECT_FALSE(stopped.image);
        EXPECT_NE(stopped.error.find("abort"), std::string::npos) << stopped.error;
    }

    OrvaneDoc doc;
    auto *tool = Orvane::Test::AddImageSource(doc, "S", src);
    Ref<ImageFormat> f = MakeFormat("TargaFormat");
    f->AddSaveInputs(tool);
    for (const char *id : {"SaveAlpha", "Compress"}) {
        Input *in = tool->FindInput(id);
        ASSERT_NE(in, nullptr) << id;
        EXPECT_EQ(in->Tags().GetID(InputControl), CLSID_InputControl_Checkbox);
        auto *def = dynamic_cast<const Number *>(in->Default().Get());
        ASSERT_NE(def, nullptr);
        EXPECT_EQ(def->value, 1.0);
    }
    EXPECT_EQ(tool->FindInput("SaveAlpha")->Name(), "Save Alpha");
    EXPECT_EQ(tool->FindInput("Compress")->Name(), "Compress");
    // Defaults: compressed, with alpha.
    EXPECT_EQ(b[2], 10);
    EXPECT_EQ(b[16], 32);
    // Predicted sizes cover the file.
    Request req(tool, nullptr, 0.0, 0, nullptr);
    f->SetupSave(tool, &req);
    EXPECT_GE(f->PredictFileSize(src.Get()), int64_t(b.size()));

    Ref<ImageFormat> c = MakeFormat("TargaFormat");
    MemoryIO good(b), shortHeader(Bytes(b.begin(), b.begin() + 10));
    Bytes badType = b;
    badType[2] = 4;
    MemoryIO bad(badType);
    EXPECT_TRUE(c->CheckFormat(&good));
    EXPECT_FALSE(c->CheckFormat(&shortHeader));
    EXPECT_FALSE(c->CheckFormat(&bad));
}

TEST_F(TargaFormatTest, RefusedAndDamagedFilesFailCleanly) {
    Ref<Image> src = Image8(7, 4);
    for (const Bytes &good : {Save("TargaFormat", src.Get()), SaveWith("TargaFormat", src.Get(), {{"Compress", 0}}),
                              SaveWith("TargaFormat", src.Get(), {{"Compress", 1}, {"SaveAlpha", 0}})}) {
        ASSERT_TRUE(Load("TargaFormat", good).image);
        for (size_t cut = 0; cut < good.size(); ++cut) {
            const LoadResult r = Load("TargaFormat", Bytes(good.begin(), good.begin() + long(cut)));
            ASSERT_FALSE(r.image) << "cut at " << cut;
        }
        for (size_t at = 0; at < 18; ++at)
            for (uint8_t mask : {uint8_t(0xff), uint8_t(0x80), uint8_t(0x01), uint8_t(0x20)}) {
                Bytes bad = good;
                bad[at] ^= mask;
                const LoadResult r = Load("TargaFormat", bad);
                if (r.image) {
                    EXPECT_GT(r.image->Width(), 0);
                }
            }
        // Flipped bytes anywhere in run-length data: never a crash.
        for (size_t at = 18; at < good.size(); ++at) {
            Bytes bad = good;
            bad[at] ^= 0x80;
            const LoadResult r = Load("TargaFormat", bad);
            if (r.image) {
                EXPECT_EQ(r.image->Width(), 7);
            }
        }
    }
    for (int type : {0, 4, 8, 12, 32, 33, 255})
        EXPECT_FALSE(Load("TargaFormat", Header(type, 1, 1, 24, 0)).headerOk) << type;
    for (int bits : {0, 1, 4, 15, 48}) EXPECT_FALSE(Load("TargaFormat", Header(2, 1, 1, bits, 0)).headerOk) << bits;
    EXPECT_FALSE(Load("TargaFormat", Header(2, 0, 1, 24, 0)).headerOk);
    EXPECT_FALSE(Load("TargaFormat", Header(1, 1, 1, 8, 0)).headerOk);                // mapped without a map
    EXPECT_FALSE(Load("TargaFormat", Header(1, 1, 1, 8, 0, 0, 1, 0, 2, 7)).headerOk); // bad entry size
}

} // namespace tga_format_test
} // namespace Orvane
