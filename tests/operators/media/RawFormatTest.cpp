// RawFormat: everything an image carries, the header byte for byte, run-length packets, damaged files.
#include <bit>

#include "host/image/PixelMemory.h"
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace raw_format_test {

using namespace Orvane::FmtTest;

class RawFormatTest : public FormatSuite {};

int32_t S32(const Bytes &b, size_t at) { return static_cast<int32_t>(U32(b, at)); }
int16_t S16(const Bytes &b, size_t at) { return static_cast<int16_t>(b[at] | b[at + 1] << 8); }
double F64(const Bytes &b, size_t at) { return std::bit_cast<double>(U32(b, at) | uint64_t(U32(b, at + 4)) << 32); }

constexpr Tag kTimeCode = 0x10020012;
constexpr Tag kTextAttr = 0x30020100, kIdAttr = 0x80020100, kDoubleAttr = 0x20020100, kIntAttr = 0x10020100;

Bytes SaveRaw(Image *img, int compression) {
    return SaveWith("RawFormat", img, {{"Compression", double(compression)}});
}

void RestoreTags(ImageFormat &f) { f.SetAttrsTagList({{FormatRestoreTags, 1}}); }

/// A frame with everything an image can carry: a data window reaching out of the frame, a smaller valid window, canvas
/// colour, aspect, attributes of every kind, two auxiliary channels and Metadata. Pixel bytes come from Value8, so
/// there are runs, and on float depths any bit pattern.
Ref<Image> Rich(int depth, int w = 37, int h = 9, ImgRectI dw = ImgRectI(-3, -2, 30, 11)) {
    const ImgRectI valid(0, 0, 20, 5);
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1.0f};
    const TagList tags = {
        {ImgWidth, w},      {ImgHeight, h},        {ImgDepth, depth},        {ImgXScale, 1.5},
        {ImgYScale, 0.75},  {ImgDataWindow, &dw},  {ImgValidWindow, &valid}, {ImgCanvasColor, &canvas},
        {ImgFullWidth, 74}, {ImgFullHeight, 18},   {ImgFullXScale, 3.0},     {ImgFullYScale, 1.5},
        {ImgField, 1},      {ImgFieldOffset, 0.5}, {ImgProxyScale, 2}};
    Ref<Image> img = NewImageTagList(tags);
    EXPECT_TRUE(img);
    img->SetAttrsTagList({{kTimeCode, 90125},
                          {kTextAttr, "a text attribute"},
                          {kIdAttr, OvID("SomeID")},
                          {kDoubleAttr, -2.5},
                          {kIntAttr, -7}});
    img->SetIsOpaque(true);
    img->SetSimple(false);
    EXPECT_TRUE(img->AddAuxChannel(AuxChannelKind::Z));
    EXPECT_TRUE(img->AddAuxChannel(AuxChannelKind::VectorY));
    EXPECT_TRUE(img->AllocScanLineData());
    const int bpp = img->BytesPerPixel();
    for (int y = dw.y0; y < dw.y1; ++y) {
        uint8_t *row = img->ScanLine(y);
        for (int i = 0; i < dw.Width() * bpp; ++i) row[i] = Value8(i / bpp, y, i % bpp, unsigned(depth));
        for (int x = 0; x < dw.Width(); ++x) {
            img->AuxRow(AuxChannelKind::Z, y)[x] = x * 0.25f - y;
            img->AuxRow(AuxChannelKind::VectorY, y)[x] = (x % 3) * -1.5f;
        }
    }
    ScriptVal inner = ScriptVal::Table();
    inner.Append(1.0).Append("two").Append(true);
    img->Metadata() = ScriptVal::Table().Set("ColorSpace", "sRGB").Set("Gamma", 2.2).Set("List", inner);
    return img;
}

/// The canvas colour as `depth` stores it.
FltPixel StoredCanvas(const Image &img, int depth, uint8_t *px) {
    FltPixel c = img.GetCanvasColor(), stored;
    StoreFlt(depth, &c, 1, px);
    LoadFlt(depth, px, 1, &stored);
    return stored;
}

TEST_F(RawFormatTest, EveryDepthUnderEveryCompressionRoundTrips) {
    for (int depth = 1; depth <= 8; ++depth) {
        Ref<Image> src = Rich(depth);
        for (int compression : {0, 1, 2}) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " compression " + std::to_string(compression));
            const Bytes b = SaveRaw(src.Get(), compression);
            ASSERT_FALSE(b.empty());
            EXPECT_EQ(S32(b, 700), compression);
            const LoadResult r = Load("RawFormat", b, {}, RestoreTags);
            ASSERT_TRUE(r.image) << r.error;
            const Image &got = *r.image;
            EXPECT_EQ(std::tuple(got.Width(), got.Height(), got.XScale(), got.YScale()), std::tuple(37, 9, 1.5, 0.75));
            EXPECT_EQ(got.ValidWindow(), src->ValidWindow());
            uint8_t px[16];
            EXPECT_EQ(got.GetCanvasColor(), StoredCanvas(*src, depth, px));
            EXPECT_EQ(got.Metadata(), src->Metadata());
            EXPECT_TRUE(got.IsOpaque() && !got.IsSimple());
            for (const TagItem &item : src->Attrs().Items()) {
                const TagItem *g = got.Attrs().Find(item.tag);
                ASSERT_NE(g, nullptr) << std::hex << item.tag;
                if (KindOfTag(item.tag) == TagKind::Text)
                    EXPECT_STREQ(g->AsText(), item.AsText());
                else if (KindOfTag(item.tag) == TagKind::ID)
                    EXPECT_EQ(g->AsID(), item.AsID());
                else
                    EXPECT_EQ(g->value, item.value) << std::hex << item.tag;
            }
            // One channel attribute per slot of the main pixel.
            std::vector<long long> channels;
            for (const TagItem *t : got.Attrs().FindAll(ImgChannel)) channels.push_back(t->AsInt());
            EXPECT_EQ(channels, (depth <= 4 ? std::vector<long long>{3} : std::vector<long long>{0, 1, 2, 3}));
            ASSERT_EQ(got.DataWindow(), src->DataWindow());
            ExpectSameRows(*src, got, src->DataWindow());
            // Regions of it and a header-only read keep the window and the auxiliary planes.
            ExpectRegionsMatchFullRead("RawFormat", b);
            const LoadResult pre = Load("RawFormat", b, {{ClipFrameHeaderOnly, 1}});
            ASSERT_TRUE(pre.image) << pre.error;
            EXPECT_EQ(pre.image->DataWindow(), src->DataWindow());
        }
    }
}

TEST_F(RawFormatTest, HeaderFieldsByteForByte) {
    for (int depth : {1, 5, 8}) {
        Ref<Image> src = Rich(depth);
        const int mainPix = src->BytesPerPixel(), auxPix = 8, rows = 13, cols = 33;
        for (int compression : {0, 2}) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " compression " + std::to_string(compression));
            const Bytes b = SaveRaw(src.Get(), compression);
            ASSERT_GT(b.size(), 712u);
            EXPECT_EQ(std::memcmp(b.data(), "RAWI", 4), 0);
            const uint32_t tagEnd = U32(b, 4), tagAt = U32(b, 8), dataAt = U32(b, 12);
            EXPECT_EQ(U32(b, 704), 712u);                             // canvas colour
            EXPECT_EQ(U32(b, 708), uint32_t(712 + mainPix + auxPix)); // Metadata block
            EXPECT_GT(tagAt, U32(b, 708) + 8);                        // Metadata present
            EXPECT_TRUE(tagEnd >= tagAt && dataAt % 512 == 0 && dataAt >= tagEnd && dataAt < tagEnd + 512)
                << tagAt << " " << tagEnd << " " << dataAt;
            for (uint32_t i = tagEnd; i < dataAt; ++i) ASSERT_EQ(b[i], 0) << "padding " << i;
            // The size field: the plain data's size, or patched to the bytes written.
            EXPECT_EQ(U32(b, 16), compression ? b.size() - dataAt : uint32_t(rows * cols * (mainPix + auxPix)));
            EXPECT_EQ(b.size() - dataAt, U32(b, 16));
            // Size, line sizes, depth, data and valid windows, then the proxy scale, time code, full size and field;
            // the scales and field offset are doubles.
            const int offsets[] = {20, 24, 28, 32, 36, 40, 44, 48, 52, 56, 60, 64, 68, 108, 112, 116, 120, 124, 144};
            const int want[] = {
                37, 9, cols * mainPix, cols * auxPix, depth, -3, -2, 30, 11, 0, 0, 20, 5, 2, 0, 90125, 74, 18, 1};
            for (size_t i = 0; i < std::size(offsets); ++i) EXPECT_EQ(S32(b, offsets[i]), want[i]) << offsets[i];
            for (auto [at, v] : {std::pair{72, 1.5}, {80, 0.75}, {96, 0.5}, {128, 3.0}, {136, 1.5}})
                EXPECT_EQ(F64(b, at), v) << "at " << at;
            for (auto [at, v] : {std::pair{180, mainPix}, {182, auxPix}, {184, 64}}) EXPECT_EQ(S16(b, at), v) << at;
            // Slot tables: main, reserved, auxiliary, reserved; byte offsets in the pixel or -1.
            for (int s = 0; s < 64; ++s) {
                const int main = depth >= 5 && s < 4 ? s * (depth == 5 ? 1 : 4) : depth < 5 && s == 3 ? 0 : -1;
                const int aux = s == 4 + int(AuxChannelKind::Z) ? 0 : s == 4 + int(AuxChannelKind::VectorY) ? 4 : -1;
                EXPECT_EQ(
                    std::tuple(S16(b, 186 + 2 * s), S16(b, 314 + 2 * s), S16(b, 442 + 2 * s), S16(b, 570 + 2 * s)),
                    std::tuple(main, -1, aux, -1))
                    << "slot " << s;
            }
            // Canvas colour: one main pixel as the depth stores it, then a zero auxiliary pixel.
            uint8_t px[24] = {};
            StoredCanvas(*src, depth, px);
            EXPECT_EQ(Bytes(&b[712], &b[712 + mainPix + auxPix]), Bytes(px, px + mainPix + auxPix));
            // Plain pixel data: the bottom line of the window first, main plane then auxiliary.
            if (compression == 0) {
                EXPECT_EQ(std::memcmp(&b[dataAt], src->ScanLine(-2), size_t(cols * mainPix)), 0);
                float z;
                std::memcpy(&z, &b[dataAt + rows * cols * mainPix], 4);
                EXPECT_EQ(z, 0 * 0.25f + 2);
            }
        }
    }
    // PredictFileSize, worked out from its definition.
    Ref<Image> img = Rich(6);
    Ref<ImageFormat> f = MakeFormat("RawFormat");
    const int64_t text = int64_t(img->Metadata().ToText().size()) + 1;
    EXPECT_EQ(f->PredictFileSize(img.Get()), 13 * ((8 + 8) * 33 + (33 + 127) / 128) + 1024 + 8 + 8 + text);
    // Run-length by default, through a tool or without one.
    EXPECT_EQ(S32(Save("RawFormat", img.Get()), 700), 2);
    EXPECT_EQ(S32(SaveWith("RawFormat", img.Get(), {}), 700), 2);
}

TEST_F(RawFormatTest, RunLengthPackets) {
    auto line = [](int depth, int w, auto value) {
        Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, 1}, {ImgDepth, depth}});
        EXPECT_TRUE(img->AllocScanLineData());
        const int bpp = img->BytesPerPixel();
        for (int x = 0; x < w; ++x)
            for (int k = 0; k < bpp; ++k) img->ScanLine(0)[x * bpp + k] = value(x, k);
        return img;
    };
    auto data = [](const Ref<Image> &img) {
        const Bytes b = SaveRaw(img.Get(), 2);
        const LoadResult r = Load("RawFormat", b); // each decodes back
        EXPECT_TRUE(r.image) << r.error;
        if (r.image) ExpectSameRows(*img, *r.image, img->DataWindow());
        return Bytes(b.begin() + U32(b, 12), b.end());
    };
    // Exactly 128 equal elements: one packet with control byte 255; 129: a run of 128 and a literal of one.
    EXPECT_EQ(data(line(1, 128, [](int, int) { return uint8_t(9); })), (Bytes{0xff, 9}));
    EXPECT_EQ(data(line(1, 129, [](int, int) { return uint8_t(9); })), (Bytes{0xff, 9, 0x00, 9}));
    // 16-byte elements (RGBA float32), equality over the whole element.
    Bytes expect{0x82};
    for (int k = 0; k < 16; ++k) expect.push_back(uint8_t(k));
    expect.push_back(0x00);
    for (int k = 0; k < 16; ++k) expect.push_back(uint8_t(k == 15 ? 99 : k));
    EXPECT_EQ(data(line(8, 4, [](int x, int k) { return uint8_t(x < 3 ? k : (k == 15 ? 99 : k)); })), expect);
    // Literals end where a run begins: 1 2 3 3 (int16 mask).
    EXPECT_EQ(data(line(2, 4, [](int x, int k) { return uint8_t(k ? 0 : std::min(x, 2) + 1); })),
              (Bytes{0x01, 1, 0, 2, 0, 0x81, 3, 0}));
    // 300 different values: literal packets of 128, 128, 44.
    const Bytes dd = data(line(2, 300, [](int x, int k) { return uint8_t(k ? x >> 8 : x); }));
    ASSERT_EQ(dd.size(), 3u + 300 * 2);
    EXPECT_EQ(std::tuple(dd[0], dd[1 + 256], dd[2 + 512]), std::tuple(127, 127, 43));
}

TEST_F(RawFormatTest, MetadataOf64KiBOrMoreIsDropped) {
    for (size_t len : {size_t(1000), size_t(60000), size_t(70000)}) {
        Ref<Image> img = Rich(5, 4, 3, ImgRectI(0, 0, 4, 3));
        ScriptVal meta = ScriptVal::Table();
        std::string text(len, 'x');
        for (size_t i = 0; i < len; ++i) text[i] = static_cast<char>('a' + (i * 7 + i / 13) % 26);
        meta.Set("Long", text);
        img->Metadata() = meta;
        const Bytes b = SaveRaw(img.Get(), 1);
        const uint32_t textSize = U32(b, U32(b, 708) + 4);
        EXPECT_EQ(textSize, img->Metadata().ToText().size() + 1);
        const LoadResult r = Load("RawFormat", b);
        ASSERT_TRUE(r.image) << r.error;
        if (textSize < 0x10000)
            EXPECT_EQ(r.image->Metadata(), meta) << len;
        else
            EXPECT_EQ(r.image->Metadata().Size(), 0u) << len;
        ExpectSameRows(*img, *r.image, img->DataWindow()); // the pixels read either way
    }
    // No Metadata: no block, and the tag block follows the canvas directly.
    const Bytes b = SaveRaw(Image8(3, 2).Get(), 0);
    EXPECT_EQ(U32(b, 8), U32(b, 708));
    const LoadResult r = Load("RawFormat", b);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(r.image->Metadata().Size(), 0u);
}

TEST_F(RawFormatTest, EmptyDataWindowReadsNoPixels) {
    const ImgRectI empty;
    const FltPixel canvas{1, 0, 0.5f, 1};
    for (int compression : {0, 1, 2}) {
        Ref<Image> img =
            NewImageTagList({{ImgWidth, 8}, {ImgHeight, 4}, {ImgDepth, DepthRGBAFlt16}, {ImgDataWindow, &empty}});
        img->SetCanvasColor(canvas);
        const Bytes b = SaveRaw(img.Get(), compression);
        EXPECT_EQ(b.size(), U32(b, 12)); // nothing after the header
        const LoadResult r = Load("RawFormat", b);
        ASSERT_TRUE(r.image) << r.error;
        EXPECT_TRUE(r.image->DataWindow().IsNull() && !r.image->HasScanLineData());
        EXPECT_EQ(r.image->GetCanvasColor(), canvas);
    }
}

TEST_F(RawFormatTest, AttributesAreRestoredOnlyWhenAsked) {
    const LoadResult r = Load("RawFormat", SaveRaw(Rich(5).Get(), 2));
    ASSERT_TRUE(r.image) << r.error;
    // The header's own fields always come back...
    for (auto [tag, v] :
         {std::pair{ImgFullWidth, 74}, {ImgFullHeight, 18}, {ImgField, 1}, {ImgProxyScale, 2}, {kTimeCode, 90125}})
        EXPECT_EQ(r.image->GetAttrL(tag), v) << std::hex << tag;
    EXPECT_EQ(std::pair(r.image->GetAttrD(ImgFullXScale), r.image->GetAttrD(ImgFieldOffset)), std::pair(3.0, 0.5));
    // ...the tag block and the flags only with the format attribute.
    EXPECT_FALSE(r.image->Attrs().Has(kTextAttr) || r.image->Attrs().Has(kIntAttr) || r.image->IsOpaque());
    // A plain frame writes the neutral values and reads back without extra attributes.
    const Bytes p = SaveRaw(Image8(2, 2).Get(), 0);
    EXPECT_EQ(std::pair(S32(p, 108), S32(p, 144)), std::pair(1, -1));
    const LoadResult q = Load("RawFormat", p, {}, RestoreTags);
    ASSERT_TRUE(q.image) << q.error;
    for (Tag t : {ImgFullWidth, ImgField, ImgProxyScale, kTimeCode, ImgFieldOffset})
        EXPECT_FALSE(q.image->Attrs().Has(t)) << std::hex << t;
}

TEST_F(RawFormatTest, DamagedAndTruncatedFilesFailCleanly) {
    Ref<Image> src = Rich(6, 20, 6, ImgRectI(-1, 0, 19, 7));
    for (int compression : {0, 1, 2}) {
        SCOPED_TRACE("compression " + std::to_string(compression));
        const Bytes good = SaveRaw(src.Get(), compression);
        const size_t dataAt = U32(good, 12);
        ExpectDamageFailsCleanly("RawFormat", good, dataAt, true, 0, RestoreTags);
        for (size_t cut = dataAt + 1; cut < good.size(); cut += 13) {
            const LoadResult r = Load("RawFormat", Bytes(good.begin(), good.begin() + long(cut)));
            ASSERT_NE(r.error.find("truncated"), std::string::npos) << cut << ": " << r.error;
        }
    }
    // The size may be told by the file alone.
    Bytes c = SaveRaw(src.Get(), 0);
    Put32(c, 16, 12345);
    EXPECT_TRUE(Load("RawFormat", c).image);
    // With the size field at the frame's height (6 lines of 7 stored), only that many bytes are read: the last
    // auxiliary lines stay zero.
    Bytes d = SaveRaw(src.Get(), 0);
    const uint32_t oneRow = 20 * 8 + 20 * 8; // main and auxiliary line of the window
    Put32(d, 16, oneRow * 6);
    const LoadResult part = Load("RawFormat", d);
    ASSERT_TRUE(part.image) << part.error;
    ExpectSameRows(*src, *part.image, ImgRectI(-1, 0, 19, 5));
    for (int y : {5, 6}) {
        ASSERT_EQ(std::memcmp(part.image->ScanLine(y), src->ScanLine(y), 20 * 8), 0); // main plane complete
        for (int x = 0; x < 20; ++x) ASSERT_EQ(part.image->AuxRow(AuxChannelKind::Z, y)[x], 0.f) << x << "," << y;
    }
}

TEST_F(RawFormatTest, UnsupportedAndAbsurdHeadersAreRefused) {
    const Bytes good = SaveRaw(Rich(5).Get(), 2);
    // A depth out of range, a tag offset inside the fixed header, an unknown compression.
    for (auto [at, value, word] : {std::tuple{36, 0u, "depth"},
                                   {36, 9u, "depth"},
                                   {36, 0xffffffffu, "depth"},
                                   {36, 255u, "depth"},
                                   {8, 700u, "tag"},
                                   {700, 3u, "compression"}}) {
        Bytes bad = good;
        Put32(bad, at, value);
        const LoadResult r = Load("RawFormat", bad);
        EXPECT_FALSE(r.headerOk) << at << " = " << value;
        EXPECT_NE(r.error.find(word), std::string::npos) << r.error;
    }
    // Plain data whose size agrees with neither the size field nor the file.
    Bytes b = SaveRaw(Rich(6).Get(), 0);
    Put32(b, 16, U32(b, 16) + 4);
    b.push_back(0);
    EXPECT_FALSE(Load("RawFormat", b).headerOk);
    // A window far larger than any frame, with sizes that agree.
    Bytes huge = SaveRaw(Image8(3, 2).Get(), 0);
    Put32(huge, 48, 500000), Put32(huge, 52, 500000); // x1, y1
    Put32(huge, 28, 500000 * 4);                      // main line size
    Put32(huge, 16, 500000 * 4 * 2);                  // size field = line size * height
    EXPECT_EQ(Load("RawFormat", huge).error,
              "needs 931.4 GiB for the 500000x500000 RGBA int8 image its header describes; the memory limit is " +
                  FormatBytes(PixelMemoryLimit()));
}

} // namespace raw_format_test
} // namespace Orvane
