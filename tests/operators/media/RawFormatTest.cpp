// RawFormat: every depth under every compression with windows that leave
// the frame, canvas, aspect, attributes, auxiliary channels and Metadata;
// the header byte for byte; run-length packets; the Metadata size limit;
// empty windows; region reads; the abort word; options; damaged and
// truncated files.
#include <cmath>
#include <cstring>

#include "host/image/PixelMemory.h"
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace raw_format_test {

using namespace Orvane::FmtTest;

class RawFormatTest : public FormatSuite {};

uint32_t U32(const Bytes &b, size_t at) { return b[at] | b[at + 1] << 8 | b[at + 2] << 16 | uint32_t(b[at + 3]) << 24; }
int32_t S32(const Bytes &b, size_t at) { return static_cast<int32_t>(U32(b, at)); }
int16_t S16(const Bytes &b, size_t at) { return static_cast<int16_t>(b[at] | b[at + 1] << 8); }
double F64(const Bytes &b, size_t at) {
    uint64_t bits = U32(b, at) | uint64_t(U32(b, at + 4)) << 32;
    double d;
    std::memcpy(&d, &bits, 8);
    return d;
}
void Put32(Bytes &b, size_t at, uint32_t v) {
    for (int i = 0; i < 4; ++i) b[at + i] = static_cast<uint8_t>(v >> (8 * i));
}

constexpr Tag kTimeCode = 0x10020012;
constexpr Tag kTextAttr = 0x30020100, kIdAttr = 0x80020100, kDoubleAttr = 0x20020100, kIntAttr = 0x10020100;

Bytes SaveRaw(Image *img, int compression) {
    return SaveWith("RawFormat", img, {{"Compression", double(compression)}});
}

auto RestoreTags = [](ImageFormat &f) { f.SetAttrsTagList({{FormatRestoreTags, 1}}); };

/// A frame with everything an image can carry: a data window reaching out
/// of the frame, a smaller valid window, canvas colour, aspect, attributes of
/// every kind, two auxiliary channels and Metadata. Pixel bytes come from
/// Value8, so there are runs, and on float depths any bit pattern.
Ref<Image> Rich(int depth, int w = 37, int h = 9, ImgRectI dw = ImgRectI(-3, -2, 30, 11)) {
    const ImgRectI valid(0, 0, 20, 5);
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1.0f};
    Ref<Image> img = NewImageTagList({{ImgWidth, w},
                                      {ImgHeight, h},
                                      {ImgDepth, depth},
                                      {ImgXScale, 1.5},
                                      {ImgYScale, 0.75},
                                      {ImgDataWindow, &dw},
                                      {ImgValidWindow, &valid},
                                      {ImgCanvasColor, &canvas},
                                      {ImgFullWidth, 74},
                                      {ImgFullHeight, 18},
                                      {ImgFullXScale, 3.0},
                                      {ImgFullYScale, 1.5},
                                      {ImgField, 1},
                                      {ImgFieldOffset, 0.5},
                                      {ImgProxyScale, 2}});
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
    ScriptVal meta = ScriptVal::Table();
    meta.Set("ColorSpace", "sRGB");
    meta.Set("Gamma", 2.2);
    ScriptVal inner = ScriptVal::Table();
    inner.Append(1.0), inner.Append("two"), inner.Append(true);
    meta.Set("List", inner);
    img->Metadata() = meta;
    return img;
}

/// Main rows and auxiliary planes of `got` equal those of `src` over `win`.
void ExpectPixels(const Image &src, const Image &got, const ImgRectI &win) {
    const int bpp = src.BytesPerPixel();
    for (int y = win.y0; y < win.y1; ++y) {
        ASSERT_EQ(std::memcmp(got.PixelAddress(win.x0, y), src.PixelAddress(win.x0, y), size_t(win.Width()) * bpp), 0)
            << "row " << y;
        for (AuxChannelKind k : {AuxChannelKind::Z, AuxChannelKind::VectorY}) {
            if (!src.HasAuxChannel(k)) continue;
            ASSERT_TRUE(got.HasAuxChannel(k));
            const float *a = src.AuxRow(k, y) + (win.x0 - src.DataWindow().x0);
            const float *b = got.AuxRow(k, y) + (win.x0 - got.DataWindow().x0);
            ASSERT_EQ(std::memcmp(a, b, sizeof(float) * win.Width()), 0) << "aux row " << y;
        }
    }
}

void ExpectAttrs(const Image &src, const Image &got) {
    for (const TagItem &item : src.Attrs().Items()) {
        const TagItem *g = got.Attrs().Find(item.tag);
        ASSERT_NE(g, nullptr) << std::hex << item.tag;
        if (KindOfTag(item.tag) == TagKind::Text)
            EXPECT_STREQ(g->AsText(), item.AsText());
        else if (KindOfTag(item.tag) == TagKind::ID)
            EXPECT_EQ(g->AsID(), item.AsID());
        else
            EXPECT_EQ(g->value, item.value) << std::hex << item.tag;
    }
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
            EXPECT_EQ(got.Depth(), depth);
            EXPECT_EQ(got.Width(), 37);
            EXPECT_EQ(got.Height(), 9);
            EXPECT_EQ(got.XScale(), 1.5);
            EXPECT_EQ(got.YScale(), 0.75);
            EXPECT_EQ(got.DataWindow(), src->DataWindow());
            EXPECT_EQ(got.ValidWindow(), src->ValidWindow());
            // The canvas as the depth stores it.
            FltPixel c = src->GetCanvasColor(), stored;
            uint8_t px[16];
            StoreFlt(depth, &c, 1, px);
            LoadFlt(depth, px, 1, &stored);
            EXPECT_EQ(got.GetCanvasColor(), stored);
            EXPECT_EQ(got.Metadata(), src->Metadata());
            EXPECT_TRUE(got.IsOpaque());
            EXPECT_FALSE(got.IsSimple());
            ExpectAttrs(*src, got);
            // One channel attribute per slot of the main pixel.
            std::vector<long long> channels;
            for (const TagItem *t : got.Attrs().FindAll(ImgChannel)) channels.push_back(t->AsInt());
            const std::vector<long long> expectChannels =
                depth <= 4 ? std::vector<long long>{3} : std::vector<long long>{0, 1, 2, 3};
            EXPECT_EQ(channels, expectChannels);
            ExpectPixels(*src, got, src->DataWindow());
        }
    }
}

TEST_F(RawFormatTest, HeaderFieldsByteForByte) {
    for (int depth : {1, 5, 8}) {
        Ref<Image> src = Rich(depth);
        const int mainPix = src->BytesPerPixel(), auxPix = 8;
        for (int compression : {0, 2}) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " compression " + std::to_string(compression));
            const Bytes b = SaveRaw(src.Get(), compression);
            ASSERT_GT(b.size(), 712u);
            EXPECT_EQ(std::memcmp(b.data(), "RAWI", 4), 0);
            const uint32_t tagEnd = U32(b, 4), tagAt = U32(b, 8), dataAt = U32(b, 12);
            EXPECT_EQ(U32(b, 704), 712u);                             // canvas colour
            EXPECT_EQ(U32(b, 708), uint32_t(712 + mainPix + auxPix)); // Metadata block
            EXPECT_GT(tagAt, U32(b, 708) + 8);                        // Metadata present
            EXPECT_GE(tagEnd, tagAt);
            EXPECT_EQ(dataAt % 512, 0u);
            EXPECT_GE(dataAt, tagEnd);
            EXPECT_LT(dataAt, tagEnd + 512);
            for (uint32_t i = tagEnd; i < dataAt; ++i) ASSERT_EQ(b[i], 0) << "padding " << i;
            const int64_t rows = 13, cols = 33;
            if (compression == 0)
                EXPECT_EQ(U32(b, 16), uint32_t(rows * cols * (mainPix + auxPix)));
            else
                EXPECT_EQ(U32(b, 16), uint32_t(b.size() - dataAt)); // patched to the bytes written
            EXPECT_EQ(b.size() - dataAt, compression == 0 ? size_t(rows * cols * (mainPix + auxPix)) : U32(b, 16));
            EXPECT_EQ(S32(b, 20), 37);
            EXPECT_EQ(S32(b, 24), 9);
            EXPECT_EQ(S32(b, 28), cols * mainPix);
            EXPECT_EQ(S32(b, 32), cols * auxPix);
            EXPECT_EQ(S32(b, 36), depth);
            const int32_t dw[4] = {-3, -2, 30, 11}, vw[4] = {0, 0, 20, 5};
            for (int i = 0; i < 4; ++i) {
                EXPECT_EQ(S32(b, 40 + 4 * i), dw[i]);
                EXPECT_EQ(S32(b, 56 + 4 * i), vw[i]);
            }
            EXPECT_EQ(F64(b, 72), 1.5);
            EXPECT_EQ(F64(b, 80), 0.75);
            EXPECT_EQ(F64(b, 96), 0.5);
            EXPECT_EQ(S32(b, 108), 2);
            EXPECT_EQ(S32(b, 112), 0);
            EXPECT_EQ(S32(b, 116), 90125);
            EXPECT_EQ(S32(b, 120), 74);
            EXPECT_EQ(S32(b, 124), 18);
            EXPECT_EQ(F64(b, 128), 3.0);
            EXPECT_EQ(F64(b, 136), 1.5);
            EXPECT_EQ(S32(b, 144), 1);
            EXPECT_EQ(S16(b, 180), mainPix);
            EXPECT_EQ(S16(b, 182), auxPix);
            EXPECT_EQ(S16(b, 184), 64);
            const int comp = depth == 1 ? 1 : depth == 5 ? 1 : 4;
            for (int s = 0; s < 64; ++s) {
                int expect = -1;
                if (depth >= 5 && s < 4) expect = s * comp;
                if (depth < 5 && s == 3) expect = 0;
                EXPECT_EQ(S16(b, 186 + 2 * s), expect) << "main slot " << s;
                EXPECT_EQ(S16(b, 314 + 2 * s), -1) << "reserved " << s;
                const int auxExpect = s == 4 + int(AuxChannelKind::Z)         ? 0
                                      : s == 4 + int(AuxChannelKind::VectorY) ? 4
                                                                              : -1;
                EXPECT_EQ(S16(b, 442 + 2 * s), auxExpect) << "aux slot " << s;
                EXPECT_EQ(S16(b, 570 + 2 * s), -1);
            }
            // Canvas colour: one main pixel as the depth stores it, then a zero auxiliary pixel.
            FltPixel c = src->GetCanvasColor();
            uint8_t px[16];
            StoreFlt(depth, &c, 1, px);
            EXPECT_EQ(std::memcmp(&b[712], px, size_t(mainPix)), 0);
            for (int i = 0; i < auxPix; ++i) EXPECT_EQ(b[712 + mainPix + i], 0);
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
    auto data = [](const Bytes &b) { return Bytes(b.begin() + U32(b, 12), b.end()); };
    // Exactly 128 equal elements: one packet with control byte 255.
    Ref<Image> a = line(1, 128, [](int, int) { return uint8_t(9); });
    Bytes b = SaveRaw(a.Get(), 2);
    EXPECT_EQ(data(b), (Bytes{0xff, 9}));
    // 129: a run of 128 and a literal of one.
    a = line(1, 129, [](int, int) { return uint8_t(9); });
    EXPECT_EQ(data(SaveRaw(a.Get(), 2)), (Bytes{0xff, 9, 0x00, 9}));
    // 16-byte elements (RGBA float32), equality over the whole element.
    Ref<Image> f = line(8, 4, [](int x, int k) { return uint8_t(x < 3 ? k : (k == 15 ? 99 : k)); });
    Bytes expect{0x82};
    for (int k = 0; k < 16; ++k) expect.push_back(uint8_t(k));
    expect.push_back(0x00);
    for (int k = 0; k < 16; ++k) expect.push_back(uint8_t(k == 15 ? 99 : k));
    EXPECT_EQ(data(SaveRaw(f.Get(), 2)), expect);
    // Literals end where a run begins: 1 2 3 3 (int16 mask).
    Ref<Image> s = line(2, 4, [](int x, int k) { return uint8_t(k ? 0 : std::min(x, 2) + 1); });
    EXPECT_EQ(data(SaveRaw(s.Get(), 2)), (Bytes{0x01, 1, 0, 2, 0, 0x81, 3, 0}));
    // 300 different values: literal packets of 128, 128, 44.
    Ref<Image> d = line(2, 300, [](int x, int k) { return uint8_t(k ? x >> 8 : x); });
    const Bytes dd = data(SaveRaw(d.Get(), 2));
    ASSERT_EQ(dd.size(), 3u + 300 * 2);
    EXPECT_EQ(dd[0], 127);
    EXPECT_EQ(dd[1 + 256], 127);
    EXPECT_EQ(dd[2 + 512], 43);
    // Each decodes back.
    for (const Ref<Image> &img : {a, f, s, d}) {
        const LoadResult r = Load("RawFormat", SaveRaw(img.Get(), 2));
        ASSERT_TRUE(r.image) << r.error;
        ExpectPixels(*img, *r.image, img->DataWindow());
    }
}

TEST_F(RawFormatTest, DepthCodesOutsideOneToEightAreRefused) {
    const Bytes good = SaveRaw(Rich(5).Get(), 2);
    for (uint32_t code : {0u, 9u, 0xffffffffu, 255u}) {
        Bytes bad = good;
        Put32(bad, 36, code);
        const LoadResult r = Load("RawFormat", bad);
        EXPECT_FALSE(r.headerOk) << code;
        EXPECT_NE(r.error.find("depth"), std::string::npos) << r.error;
    }
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
        ExpectPixels(*img, *r.image, img->DataWindow()); // the pixels read either way
    }
    // No Metadata: no block, and the tag block follows the canvas directly.
    Ref<Image> bare = Image8(3, 2);
    const Bytes b = SaveRaw(bare.Get(), 0);
    EXPECT_EQ(U32(b, 8), U32(b, 708));
    const LoadResult r = Load("RawFormat", b);
    ASSERT_TRUE(r.image) << r.error;
    EXPECT_EQ(r.image->Metadata().Size(), 0u);
}

TEST_F(RawFormatTest, EmptyDataWindowReadsNoPixels) {
    const ImgRectI empty;
    for (int compression : {0, 1, 2}) {
        Ref<Image> img =
            NewImageTagList({{ImgWidth, 8}, {ImgHeight, 4}, {ImgDepth, DepthRGBAFlt16}, {ImgDataWindow, &empty}});
        const FltPixel canvas{1, 0, 0.5f, 1};
        img->SetCanvasColor(canvas);
        ASSERT_TRUE(img->DataWindow().IsNull());
        const Bytes b = SaveRaw(img.Get(), compression);
        EXPECT_EQ(b.size(), U32(b, 12)); // nothing after the header
        const LoadResult r = Load("RawFormat", b);
        ASSERT_TRUE(r.image) << r.error;
        EXPECT_TRUE(r.image->DataWindow().IsNull());
        EXPECT_FALSE(r.image->HasScanLineData());
        EXPECT_EQ(r.image->GetCanvasColor(), canvas);
    }
}

TEST_F(RawFormatTest, AttributesAreRestoredOnlyWhenAsked) {
    Ref<Image> src = Rich(5);
    const Bytes b = SaveRaw(src.Get(), 2);
    const LoadResult r = Load("RawFormat", b);
    ASSERT_TRUE(r.image) << r.error;
    // The header's own fields always come back...
    EXPECT_EQ(r.image->GetAttrL(ImgFullWidth), 74);
    EXPECT_EQ(r.image->GetAttrL(ImgFullHeight), 18);
    EXPECT_EQ(r.image->GetAttrL(ImgField), 1);
    EXPECT_EQ(r.image->GetAttrL(ImgProxyScale), 2);
    EXPECT_EQ(r.image->GetAttrL(kTimeCode), 90125);
    EXPECT_EQ(r.image->GetAttrD(ImgFullXScale), 3.0);
    EXPECT_EQ(r.image->GetAttrD(ImgFieldOffset), 0.5);
    // ...the tag block and the flags only with the format attribute.
    EXPECT_FALSE(r.image->Attrs().Has(kTextAttr));
    EXPECT_FALSE(r.image->Attrs().Has(kIntAttr));
    EXPECT_FALSE(r.image->IsOpaque());
    // A plain frame writes the neutral values and reads back without extra attributes.
    Ref<Image> plain = Image8(2, 2);
    const Bytes p = SaveRaw(plain.Get(), 0);
    EXPECT_EQ(S32(p, 108), 1);
    EXPECT_EQ(S32(p, 144), -1);
    const LoadResult q = Load("RawFormat", p, {}, RestoreTags);
    ASSERT_TRUE(q.image) << q.error;
    for (Tag t : {ImgFullWidth, ImgField, ImgProxyScale, kTimeCode, ImgFieldOffset})
        EXPECT_FALSE(q.image->Attrs().Has(t)) << std::hex << t;
}

TEST_F(RawFormatTest, RegionReadEqualsTheCropOfAFullRead) {
    for (int depth : {1, 6, 8}) {
        Ref<Image> src = Rich(depth);
        for (int compression : {0, 1, 2}) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " compression " + std::to_string(compression));
            const Bytes b = SaveRaw(src.Get(), compression);
            for (ImgRectI rect :
                 {ImgRectI(0, 0, 37, 9), ImgRectI(5, 3, 12, 8), ImgRectI(-10, -10, 0, 0), ImgRectI(29, 10, 50, 50)}) {
                const ImageDomain region(rect);
                const LoadResult r = Load("RawFormat", b, {{ClipFrameRegion, &region}});
                ASSERT_TRUE(r.image) << r.error;
                const ImgRectI expect = rect & src->DataWindow();
                ASSERT_EQ(r.image->DataWindow(), expect);
                ExpectPixels(*src, *r.image, expect);
            }
        }
    }
}

TEST_F(RawFormatTest, HeaderOnlyAbortOptionsAndCheck) {
    Ref<Image> src = Rich(7);
    const Bytes b = SaveRaw(src.Get(), 2);
    const LoadResult pre = Load("RawFormat", b, {{ClipFrameHeaderOnly, 1}});
    ASSERT_TRUE(pre.image) << pre.error;
    EXPECT_TRUE(pre.image->IsNoData());
    EXPECT_FALSE(pre.image->HasScanLineData());
    EXPECT_EQ(pre.image->DataWindow(), src->DataWindow());

    std::atomic<bool> abort{true};
    for (int compression : {0, 1, 2}) {
        const LoadResult stopped =
            Load("RawFormat", SaveRaw(src.Get(), compression), {}, [&](ImageFormat &f) { f.abortFlag = &abort; });
        EXPECT_TRUE(stopped.headerOk);
        EXPECT_FALSE(stopped.image);
        EXPECT_NE(stopped.error.find("abort"), std::string::npos) << stopped.error;
    }

    OrvaneDoc doc;
    auto *tool = Orvane::Test::AddImageSource(doc, "S", src);
    Ref<ImageFormat> f = MakeFormat("RawFormat");
    f->AddSaveInputs(tool);
    Input *in = tool->FindInput("Compression");
    ASSERT_NE(in, nullptr);
    EXPECT_EQ(in->Name(), "Compression");
    EXPECT_EQ(in->Tags().GetID(InputControl), CLSID_InputControl_Combo);
    std::vector<std::string> items;
    for (const TagItem *t : in->Tags().FindAll(ListAddItem)) items.push_back(t->AsText());
    EXPECT_EQ(items, (std::vector<std::string>{"None", "Zlib", "Runlength"}));
    // Default: run-length, with or without a tool.
    EXPECT_EQ(S32(Save("RawFormat", src.Get()), 700), 2);
    Request req(tool, nullptr, 0.0, 0, nullptr);
    f->SetupSave(tool, &req);
    MemoryIO io;
    ASSERT_TRUE(f->SaveHeader(&io, src.Get()) && f->SaveFrame(0, src.Get()));
    EXPECT_EQ(S32(io.Data(), 700), 2);

    Ref<ImageFormat> c = MakeFormat("RawFormat");
    MemoryIO good(b), bad(Bytes{'R', 'A', 'W', 'X'}), tiny(Bytes{'R', 'A'});
    EXPECT_TRUE(c->CheckFormat(&good));
    EXPECT_FALSE(c->CheckFormat(&bad));
    EXPECT_FALSE(c->CheckFormat(&tiny));
}

TEST_F(RawFormatTest, DamagedFilesFailCleanly) {
    Ref<Image> src = Rich(6, 20, 6, ImgRectI(-1, 0, 19, 7));
    for (int compression : {0, 1, 2}) {
        SCOPED_TRACE("compression " + std::to_string(compression));
        const Bytes good = SaveRaw(src.Get(), compression);
        const size_t dataAt = U32(good, 12);
        ASSERT_TRUE(Load("RawFormat", good).image);
        for (size_t cut = 0; cut < good.size(); cut += (cut < 720 ? 1 : 7)) {
            const LoadResult r = Load("RawFormat", Bytes(good.begin(), good.begin() + long(cut)), {}, RestoreTags);
            ASSERT_FALSE(r.image) << "cut at " << cut;
            if (cut > dataAt) {
                ASSERT_NE(r.error.find("truncated"), std::string::npos) << cut << ": " << r.error;
            }
        }
        for (size_t at = 0; at < dataAt; ++at)
            for (uint8_t mask : {uint8_t(0xff), uint8_t(0x80), uint8_t(0x01)}) {
                Bytes bad = good;
                bad[at] ^= mask;
                const LoadResult r = Load("RawFormat", bad, {}, RestoreTags);
                if (r.image) {
                    ASSERT_GT(r.image->Width(), 0);
                }
            }
        for (size_t at = dataAt; at < good.size(); at += 3) {
            Bytes bad = good;
            bad[at] ^= 0x5a;
            const LoadResult r = Load("RawFormat", bad);
            if (r.image) {
                ASSERT_EQ(r.image->DataWindow(), src->DataWindow());
            }
        }
    }
    // Plain data whose size agrees with neither the size field nor the file is refused.
    Bytes b = SaveRaw(src.Get(), 0);
    Put32(b, 16, U32(b, 16) + 4);
    b.push_back(0);
    EXPECT_FALSE(Load("RawFormat", b).headerOk);
    // The size may also be told by the file alone.
    Bytes c = SaveRaw(src.Get(), 0);
    Put32(c, 16, 12345);
    const LoadResult r = Load("RawFormat", c);
    ASSERT_TRUE(r.image) << r.error;
    // With the size field at the frame's height (6 lines of 7 stored), only
    // that many bytes are read: the last auxiliary lines stay zero.
    Bytes d = SaveRaw(src.Get(), 0);
    const uint32_t oneRow = 20 * 8 + 20 * 8; // main and auxiliary line of the window
    Put32(d, 16, oneRow * 6);
    const LoadResult part = Load("RawFormat", d);
    ASSERT_TRUE(part.image) << part.error;
    ExpectPixels(*src, *part.image, ImgRectI(-1, 0, 19, 5));
    for (int y : {5, 6}) {
        ASSERT_EQ(std::memcmp(part.image->ScanLine(y), src->ScanLine(y), 20 * 8), 0); // main plane complete
        for (int x = 0; x < 20; ++x) ASSERT_EQ(part.image->AuxRow(AuxChannelKind::Z, y)[x], 0.f) << x << "," << y;
    }
    // A window far larger than any frame, with sizes that agree, is refused.
    Bytes huge = SaveRaw(Image8(3, 2).Get(), 0);
    Put32(huge, 48, 500000), Put32(huge, 52, 500000); // x1, y1
    Put32(huge, 28, 500000 * 4);                      // main line size
    Put32(huge, 16, 500000 * 4 * 2);                  // size field = line size * height
    const LoadResult hr = Load("RawFormat", huge);
    EXPECT_EQ(hr.error,
              "needs 931.4 GiB for the 500000x500000 RGBA int8 image its header describes; the memory limit is " +
                  FormatBytes(PixelMemoryLimit()));
    // Tag offsets before the end of the fixed header are refused.
    Bytes e = SaveRaw(src.Get(), 2);
    Put32(e, 8, 700);
    EXPECT_FALSE(Load("RawFormat", e).headerOk);
    Bytes g = SaveRaw(src.Get(), 2);
    Put32(g, 700, 3);
    EXPECT_FALSE(Load("RawFormat", g).headerOk);
}

} // namespace raw_format_test
} // namespace Orvane
