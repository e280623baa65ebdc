// TargaFormat: files as an independent decoder reads them, files made by hand, proxy scale, refused headers.
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace tga_format_test {

using namespace Orvane::FmtTest;

class TargaFormatTest : public FormatSuite {};

/// An 18-byte header.
Bytes Header(int type, int w, int h, int bits, int descriptor, int idLength = 0, int mapType = 0, int mapFirst = 0,
             int mapLength = 0, int mapBits = 0) {
    Bytes b = {
        uint8_t(idLength), uint8_t(mapType),   uint8_t(type), 0, 0, 0, 0, uint8_t(mapBits), 0, 0, 0, 0, 0, 0, 0, 0,
        uint8_t(bits),     uint8_t(descriptor)};
    for (auto [at, v] : {std::pair{3, mapFirst}, {5, mapLength}, {12, w}, {14, h}}) Put16(b, at, uint32_t(v));
    return b;
}

/// Decodes run-length packets independently: the pixel bytes in order; `crossed` when a packet ran over the end of a
/// line of `w` pixels.
Bytes Unpack(const Bytes &b, size_t pos, int w, int h, int bpp, bool &crossed) {
    Bytes out;
    crossed = false;
    while (out.size() / bpp < size_t(w) * h && pos < b.size()) {
        const int c = b[pos++], n = (c & 0x7f) + 1;
        crossed |= (out.size() / bpp % w) + n > size_t(w);
        const size_t bytes = c & 0x80 ? bpp : size_t(n) * bpp;
        for (int k = 0; k < (c & 0x80 ? n : 1); ++k)
            out.insert(out.end(), b.begin() + long(pos), b.begin() + long(pos + bytes));
        pos += bytes;
    }
    EXPECT_EQ(pos, b.size()) << "packets end with the file";
    return out;
}

TEST_F(TargaFormatTest, HeadersLinesAndPacketsAsAnIndependentDecoderReadsThem) {
    for (auto [w, h] : {std::pair{1, 1}, {1, 5}, {3, 2}, {17, 9}, {130, 3}, {300, 4}}) {
        const unsigned seed = static_cast<unsigned>(w + 100 * h);
        Ref<Image> src = Image8(w, h, seed);
        for (bool alpha : {true, false})
            for (bool compress : {true, false}) {
                SCOPED_TRACE(std::to_string(w) + "x" + std::to_string(h) + (alpha ? " alpha" : "") +
                             (compress ? " rle" : " plain"));
                const Bytes b = SaveWith("TargaFormat", src.Get(),
                                         {{"SaveAlpha", alpha ? 1.0 : 0.0}, {"Compress", compress ? 1.0 : 0.0}});
                ASSERT_GE(b.size(), 18u);
                EXPECT_EQ(Bytes(b.begin(), b.begin() + 18),
                          Header(compress ? 10 : 2, w, h, alpha ? 32 : 24, alpha ? 8 : 0));
                const int bpp = alpha ? 4 : 3;
                bool crossed = false;
                const Bytes pixels = compress ? Unpack(b, 18, w, h, bpp, crossed) : Bytes(b.begin() + 18, b.end());
                EXPECT_FALSE(crossed) << "a packet ran over a line end";
                // Bottom line first, blue green red alpha.
                ASSERT_EQ(pixels.size(), size_t(w) * h * bpp);
                for (size_t i = 0; i < pixels.size(); ++i) {
                    const int c = int(i % bpp), x = int(i / bpp % w), y = int(i / bpp / w);
                    ASSERT_EQ(pixels[i], Value8(x, y, c == 3 ? 3 : 2 - c, seed)) << i;
                }
                const LoadResult r = Load("TargaFormat", b);
                ASSERT_TRUE(r.image) << r.error;
                ExpectSamePixels(*src, *r.image, alpha);
            }
    }
    // Compressed with alpha by default, through a tool or without one; the predicted size covers the file.
    Ref<Image> img = Image8(5, 5);
    int64_t predicted = 0;
    for (const Bytes &b : {Save("TargaFormat", img.Get()), SaveWith("TargaFormat", img.Get(), {}, &predicted)}) {
        EXPECT_EQ(std::pair(b[2], b[16]), std::pair(uint8_t(10), uint8_t(32)));
        EXPECT_GE(predicted, int64_t(b.size()));
    }
}

TEST_F(TargaFormatTest, PacketsFollowTheRule) {
    auto line = [](int w, int h, auto red) {
        return MakeImage(w, h, DepthRGBAInt8, [&](int x, int) { return Pixel{uint16_t(red(x) * 257), 0, 0, 65535}; });
    };
    auto data = [](Ref<Image> img) {
        const Bytes b = SaveWith("TargaFormat", img.Get(), {{"SaveAlpha", 0}});
        return Bytes(b.begin() + 18, b.end());
    };
    // Lines of 300 equal pixels: runs of 128, 128 and 44; no packet spans two lines.
    const Bytes run = {0xff, 0, 0, 255, 0xff, 0, 0, 255, 0x80 + 43, 0, 0, 255};
    Bytes two = run;
    two.insert(two.end(), run.begin(), run.end());
    EXPECT_EQ(data(line(300, 2, [](int) { return 255; })), two);
    // Two equal neighbours start a run; literals stop before one and at 128.
    const int v[6] = {1, 2, 3, 3, 3, 4};
    EXPECT_EQ(data(line(6, 1, [&](int x) { return v[x]; })),
              (Bytes{0x01, 0, 0, 1, 0, 0, 2, 0x82, 0, 0, 3, 0x00, 0, 0, 4}));
    // 200 different pixels: a literal of 128, then one of 72.
    const Bytes r = data(line(200, 1, [](int x) { return x; }));
    ASSERT_EQ(r.size(), 1 + 128 * 3 + 1 + 72 * 3u);
    EXPECT_EQ(std::tuple(r[0], r[1 + 128 * 3]), std::tuple(127, 71));
}

TEST_F(TargaFormatTest, OriginsMapsGreyAndSixteenBitFiles) {
    auto file = [](Bytes header, const Bytes &data) {
        header.insert(header.end(), data.begin(), data.end());
        return header;
    };
    auto bgra = [](int b, int g, int r, int a = 255) {
        return Pixel{uint16_t(r * 257), uint16_t(g * 257), uint16_t(b * 257), uint16_t(a * 257)};
    };
    // Every pixel of each file, bottom row first.
    const std::tuple<const char *, Bytes, std::vector<Pixel>> cases[] = {
        // Stored rows top first, columns from the right.
        {"top-origin, right to left",
         file(Header(2, 3, 2, 24, 0x30), {0, 0, 0, 1, 0, 0, 2, 0, 0, 10, 0, 0, 11, 0, 0, 12, 0, 0}),
         {bgra(12, 0, 0), bgra(11, 0, 0), bgra(10, 0, 0), bgra(2, 0, 0), bgra(1, 0, 0), bgra(0, 0, 0)}},
        // The run's fourth pixel starts the second stored line.
        {"top-origin run-length",
         file(Header(10, 3, 2, 24, 0x20), {0x83, 7, 8, 9, 0x01, 1, 2, 3, 4, 5, 6}),
         {bgra(7, 8, 9), bgra(1, 2, 3), bgra(4, 5, 6), bgra(7, 8, 9), bgra(7, 8, 9), bgra(7, 8, 9)}},
        // 24-bit entries 2, 3, 4 after an ID of 5 bytes.
        {"colour map",
         file(Header(1, 2, 1, 8, 0, 5, 1, 2, 3, 24),
              {'i', 'd', 'e', 'n', 't', 10, 20, 30, 40, 50, 60, 70, 80, 90, 4, 2}),
         {bgra(70, 80, 90), bgra(10, 20, 30)}},
        // 32-bit entries keep alpha when the descriptor says so.
        {"colour map with alpha", file(Header(1, 1, 1, 8, 8, 0, 1, 0, 1, 32), {1, 2, 3, 4, 0}), {bgra(1, 2, 3, 4)}},
        // 5-5-5 with an alpha bit: 0x8000 | 31 << 10 | 1 << 5 | 16, then 31 << 5.
        {"16 bits",
         file(Header(2, 2, 1, 16, 1), {0x30, 0xfc, 0xe0, 0x03}),
         {Pixel{255 * 257, 8 * 257, 132 * 257, 65535}, Pixel{0, 255 * 257, 0, 0}}},
        {"grey run-length",
         file(Header(11, 4, 1, 8, 0), {0x81, 50, 0x01, 7, 9}),
         {bgra(50, 50, 50), bgra(50, 50, 50), bgra(7, 7, 7), bgra(9, 9, 9)}},
    };
    for (const auto &[what, bytes, pixels] : cases) {
        SCOPED_TRACE(what);
        const LoadResult r = Load("TargaFormat", bytes);
        ASSERT_TRUE(r.image) << r.error;
        const int w = r.image->Width();
        ASSERT_EQ(size_t(w * r.image->Height()), pixels.size());
        for (int i = 0; i < int(pixels.size()); ++i) EXPECT_EQ(At(*r.image, i % w, i / w), pixels[i]) << i;
    }

    // A top-origin copy of a plain file reads the same, regions too.
    Ref<Image> src = Image8(150, 9, 4);
    const Bytes plain = SaveWith("TargaFormat", src.Get(), {{"Compress", 0}});
    Bytes flipped(plain.begin(), plain.begin() + 18);
    flipped[17] |= 0x20;
    for (int s = 8; s >= 0; --s)
        flipped.insert(flipped.end(), plain.begin() + 18 + s * 600, plain.begin() + 18 + (s + 1) * 600);
    const LoadResult r = Load("TargaFormat", flipped);
    ASSERT_TRUE(r.image) << r.error;
    ExpectSamePixels(*src, *r.image);
    ExpectRegionsMatchFullRead("TargaFormat", flipped);
}

TEST_F(TargaFormatTest, ProxyScaleOnPlainFilesOnly) {
    Ref<Image> src = Image8(9, 7, 11);
    const Bytes plain = SaveWith("TargaFormat", src.Get(), {{"Compress", 0}});
    const Bytes rle = Save("TargaFormat", src.Get());
    for (int scale : {2, 3}) {
        const LoadResult r = LoadAt("TargaFormat", plain, scale);
        ASSERT_TRUE(r.image) << r.error;
        EXPECT_EQ(std::tuple(r.image->Width(), r.image->Height(), r.image->GetAttrL(ImgFullWidth),
                             r.image->GetAttrL(ImgFullHeight)),
                  std::tuple(9 / scale, 7 / scale, 9LL, 7LL));
        for (int y = 0; y < 7 / scale; ++y)
            for (int x = 0; x < 9 / scale; ++x) ASSERT_EQ(At(*r.image, x, y), At(*src, x * scale, y * scale));
        // Image type 10 ignores the proxy scale.
        const LoadResult q = LoadAt("TargaFormat", rle, scale);
        ASSERT_TRUE(q.image) << q.error;
        ExpectSamePixels(*src, *q.image);
    }
}

TEST_F(TargaFormatTest, UnsupportedHeadersAreRefused) {
    for (int type : {0, 4, 8, 12, 32, 33, 255})
        EXPECT_FALSE(Load("TargaFormat", Header(type, 1, 1, 24, 0)).headerOk) << type;
    for (int bits : {0, 1, 4, 15, 48}) EXPECT_FALSE(Load("TargaFormat", Header(2, 1, 1, bits, 0)).headerOk) << bits;
    EXPECT_FALSE(Load("TargaFormat", Header(2, 0, 1, 24, 0)).headerOk);
    EXPECT_FALSE(Load("TargaFormat", Header(1, 1, 1, 8, 0)).headerOk);                // mapped without a map
    EXPECT_FALSE(Load("TargaFormat", Header(1, 1, 1, 8, 0, 0, 1, 0, 2, 7)).headerOk); // bad entry size
}

} // namespace tga_format_test
} // namespace Orvane
