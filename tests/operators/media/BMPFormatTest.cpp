// BMPFormat: headers and lines byte for byte, deeper images, top-down files, palettes, refused headers.
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace bmp_format_test {

using namespace Orvane::FmtTest;

class BMPFormatTest : public FormatSuite {};

/// The stored line size of 24-bit pixels: whole pixels rounded up to 4 bytes.
int64_t PaddedStride(int w) { return (int64_t(w) * 3 + 3) / 4 * 4; }

/// An 8-bit palette file made by hand. `os2`: the 12-byte header with 3-byte entries. Index of pixel (x, y) (y from the
/// bottom) = (x * 5 + y * 3) % entries.
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

TEST_F(BMPFormatTest, HeadersAndLinesByteForByteAndBackAt24And32Bits) {
    for (auto [w, h] : {std::pair{1, 1}, {1, 6}, {2, 3}, {3, 2}, {5, 4}, {7, 3}, {33, 17}}) {
        const unsigned seed = static_cast<unsigned>(w * 10 + h);
        Ref<Image> src = Image8(w, h, seed);
        for (bool alpha : {true, false}) {
            SCOPED_TRACE(std::to_string(w) + "x" + std::to_string(h) + (alpha ? " alpha" : " no alpha"));
            int64_t predicted = 0;
            const Bytes b = SaveWith("BMPFormat", src.Get(), {{"SaveAlpha", alpha ? 1.0 : 0.0}}, &predicted);
            EXPECT_EQ(predicted, int64_t(b.size()));
            const int at = alpha ? 66 : 54;
            const int64_t stride = alpha ? 4 * w : PaddedStride(w);
            ASSERT_EQ(int64_t(b.size()), at + stride * h);
            // The header as the format defines it (the file size of 24-bit files counts no padding); compression stays
            // 0 with the masks.
            Bytes header(at, 0);
            header[0] = 'B', header[1] = 'M';
            Put32(header, 2, alpha ? 4u * w * h + 66 : 3u * (w * h + 18));
            Put32(header, 10, at), Put32(header, 14, 40), Put32(header, 18, w), Put32(header, 22, h);
            Put16(header, 26, 1), Put16(header, 28, alpha ? 32 : 24), Put32(header, 34, (alpha ? 4 : 3) * w * h);
            if (alpha) Put32(header, 54, 0xff0000), Put32(header, 58, 0xff00), Put32(header, 62, 0xff);
            EXPECT_EQ(Bytes(b.begin(), b.begin() + at), header);
            // Every stored line: bottom row first, blue green red (alpha), zero padding.
            for (int y = 0; y < h; ++y)
                for (int64_t i = 0; i < stride; ++i) {
                    const int x = int(i / (alpha ? 4 : 3)), c = int(i % (alpha ? 4 : 3));
                    const uint8_t want = x >= w ? 0 : Value8(x, y, c == 3 ? 3 : 2 - c, seed);
                    ASSERT_EQ(b[at + y * stride + i], want) << i << "," << y;
                }
            const LoadResult r = Load("BMPFormat", b);
            ASSERT_TRUE(r.image) << r.error;
            EXPECT_EQ(r.image->Depth(), DepthRGBAInt8);
            ExpectSamePixels(*src, *r.image, alpha);
        }
    }
    // Alpha is saved by default, through a tool or without one.
    Ref<Image> img = Image8(2, 2);
    EXPECT_EQ(SaveWith("BMPFormat", img.Get(), {})[28], 32);
    EXPECT_EQ(Save("BMPFormat", img.Get())[28], 32);
}

TEST_F(BMPFormatTest, DeeperImagesKeepTheTopEightBitsAndCanvasFillsOutside) {
    // 16-bit values come out as value >> 8 (no rounding).
    const uint16_t vals[4] = {0x12ff, 0x0080, 0xfffe, 0x7f01};
    auto v = [&](int i) { return vals[i % 4]; };
    auto top = [](uint16_t u) { return uint16_t((u >> 8) * 257); };
    Ref<Image> src = MakeImage(4, 2, DepthRGBAInt16, [&](int x, int y) {
        return Pixel{v(x), v(x + 1), v(x + 2), v(x + y)};
    });
    const LoadResult r = Load("BMPFormat", Save("BMPFormat", src.Get()));
    ASSERT_TRUE(r.image) << r.error;
    for (int y = 0; y < 2; ++y)
        for (int x = 0; x < 4; ++x)
            EXPECT_EQ(At(*r.image, x, y), (Pixel{top(v(x)), top(v(x + 1)), top(v(x + 2)), top(v(x + y))}));
    // A data window smaller than the frame: the canvas colour outside.
    ImgRectI dw(1, 1, 3, 2);
    const FltPixel canvas{0.5f, 0.25f, 1.0f, 1.0f};
    Ref<Image> part = NewImageTagList(
        {{ImgWidth, 4}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt32}, {ImgDataWindow, &dw}, {ImgCanvasColor, &canvas}});
    ASSERT_TRUE(part->AllocScanLineData());
    part->Fill(FltPixel{0, 1, 0, 1});
    const LoadResult q = Load("BMPFormat", Save("BMPFormat", part.Get()));
    ASSERT_TRUE(q.image) << q.error;
    const Pixel in{0, 65535, 0, 65535}, out{top(FloatToU16(0.5f)), top(FloatToU16(0.25f)), 65535, 65535};
    for (int y = 0; y < 3; ++y)
        for (int x = 0; x < 4; ++x) EXPECT_EQ(At(*q.image, x, y), dw.Contains(x, y) ? in : out) << x << "," << y;
}

TEST_F(BMPFormatTest, NegativeHeightMeansTopLineFirst) {
    Ref<Image> src = Image8(7, 5, 44);
    for (bool alpha : {false, true}) {
        const Bytes b = SaveWith("BMPFormat", src.Get(), {{"SaveAlpha", alpha ? 1.0 : 0.0}});
        const size_t at = U32(b, 10), stride = alpha ? 28 : PaddedStride(7);
        Bytes flipped(b.begin(), b.begin() + long(at));
        Put32(flipped, 22, static_cast<uint32_t>(-5));
        for (int s = 4; s >= 0; --s)
            flipped.insert(flipped.end(), b.begin() + long(at + s * stride), b.begin() + long(at + (s + 1) * stride));
        const LoadResult full = Load("BMPFormat", flipped);
        ASSERT_TRUE(full.image) << full.error;
        ExpectSamePixels(*src, *full.image, alpha);
        ExpectRegionsMatchFullRead("BMPFormat", flipped);
    }
}

TEST_F(BMPFormatTest, PalettesOfShortAndLongHeaders) {
    // Width, height, short header, entries (16 colours used: only 16 are read), and a zero pixel offset (the pixels
    // follow the palette).
    for (auto [w, h, os2, entries, zeroOffset] : {std::tuple{5, 3, true, 256, false},
                                                  {8, 2, true, 256, false},
                                                  {1, 1, true, 256, false},
                                                  {6, 4, false, 16, false},
                                                  {6, 4, true, 256, true}}) {
        SCOPED_TRACE(::testing::Message() << w << "x" << h << (os2 ? " short" : " long") << " header");
        std::vector<uint8_t> pal;
        Bytes b = PaletteBMP(w, h, os2, entries, pal);
        if (zeroOffset) Put32(b, 10, 0);
        const LoadResult r = Load("BMPFormat", b);
        ASSERT_TRUE(r.image) << r.error;
        ASSERT_EQ(r.image->DataWindow(), ImgRectI(0, 0, w, h));
        for (int y = 0; y < h; ++y)
            for (int x = 0; x < w; ++x) {
                const uint8_t *e = &pal[(x * 5 + y * 3) % entries * 3];
                ASSERT_EQ(At(*r.image, x, y),
                          (Pixel{uint16_t(e[2] * 257), uint16_t(e[1] * 257), uint16_t(e[0] * 257), 65535}))
                    << x << "," << y;
            }
        if (!zeroOffset) ExpectDamageFailsCleanly("BMPFormat", b, 14 + (os2 ? 12 : 40), true);
    }
}

TEST_F(BMPFormatTest, UnsupportedAndAbsurdHeadersAreRefused) {
    const Bytes b = Save("BMPFormat", Image8(6, 5).Get());
    // Field offset, size and value: magic, bits, compression, no size, absurd width, height and pixel offset.
    for (auto [at, bytes, value] : {std::tuple{0, 2, 0x4d42u + 1},
                                    {28, 2, 1u},
                                    {28, 2, 4u},
                                    {28, 2, 16u},
                                    {28, 2, 0u},
                                    {28, 2, 64u},
                                    {30, 4, 1u},
                                    {30, 4, 2u},
                                    {30, 4, 4u},
                                    {30, 4, 5u},
                                    {18, 4, 0u},
                                    {22, 4, 0u},
                                    {18, 4, 0x7fffffffu},
                                    {22, 4, 0x80000000u},
                                    {10, 4, 0x7ffffff0u}}) {
        Bytes bad = b;
        bytes == 2 ? Put16(bad, at, value) : Put32(bad, at, value);
        EXPECT_FALSE(Load("BMPFormat", bad).headerOk) << at << " = " << value;
    }
}

} // namespace bmp_format_test
} // namespace Orvane
