// OpenEXRFormat, with files built byte by byte and by the OpenEXR tools, and the sample images against exrheader.
#include <filesystem>
#include <map>
#include <regex>
#include <tuple>

#include "host/image/Half.h"
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace exrtest_detail {

using namespace FmtTest;
const char *const kId = "OpenEXRFormat";

float Value(int x, int y, int c) { return static_cast<float>((x * 3 + y * 5 + c * 7) % 32) / 4.f - 2.f; }

/// A w x h image of `depth` whose data window is `window`; each pixel is Value() (plus a third for float32, so half
/// precision would not do).
Ref<Image> Pattern(int w, int h, int depth, const ImgRectI &window, bool smooth = false) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}, {ImgDataWindow, &window}});
    EXPECT_TRUE(img && img->AllocScanLineData());
    const float extra = depth == DepthRGBAFlt32 ? 1.f / 3.f : 0.f;
    for (int y = window.y0; y < window.y1; ++y)
        for (int x = window.x0; x < window.x1; ++x) {
            auto v = [&](int c) { return smooth ? 0.25f + 0.01f * (x + 2 * y + 5 * c) : Value(x, y, c) + extra; };
            img->PutFlt(x, y, {v(0), v(1), v(2), v(3)});
        }
    return img;
}

struct Channel {
    std::string name;
    int type; // 0 UINT, 1 HALF, 2 FLOAT
};

void Put32(Bytes &b, uint32_t v) {
    for (int i = 0; i < 4; ++i) b.push_back(static_cast<uint8_t>(v >> (8 * i)));
}
void PutBox(Bytes &b, const ImgRectI &r) { // inclusive max, as files hold it
    for (int v : {r.x0, r.y0, r.x1, r.y1}) Put32(b, static_cast<uint32_t>(v));
}
void PutText(Bytes &b, const std::string &text) { b.insert(b.end(), text.c_str(), text.c_str() + text.size() + 1); }
void Attr(Bytes &b, const std::string &name, const std::string &type, const Bytes &value) {
    PutText(b, name), PutText(b, type), Put32(b, static_cast<uint32_t>(value.size()));
    b.insert(b.end(), value.begin(), value.end());
}

/// An uncompressed scan-line file; channel c of file pixel (x, y) is value(x, y, c). A deep one holds one sample a
/// pixel.
Bytes HandMade(const ImgRectI &display, const ImgRectI &data, std::vector<Channel> channels,
               const std::function<float(int, int, const std::string &)> &value, bool deep = false) {
    std::sort(channels.begin(), channels.end(), [](auto &a, auto &b) { return a.name < b.name; });
    const int lines = data.y1 - data.y0 + 1, width = data.x1 - data.x0 + 1;
    Bytes b = {0x76, 0x2f, 0x31, 0x01, 2, uint8_t(deep ? 8 : 0), 0, 0}, v; // 8: not an image of flat pixels
    for (const Channel &c : channels) {
        PutText(v, c.name);
        for (int u : {c.type, 0, 1, 1}) Put32(v, static_cast<uint32_t>(u)); // type, linear, sampling
    }
    v.push_back(0);
    Attr(b, "channels", "chlist", v);
    Attr(b, "compression", "compression", {0});
    v.clear(), PutBox(v, data), Attr(b, "dataWindow", "box2i", v);
    v.clear(), PutBox(v, display), Attr(b, "displayWindow", "box2i", v);
    Attr(b, "lineOrder", "lineOrder", {0});
    v.clear(), Put32(v, 0x3f800000u), Attr(b, "pixelAspectRatio", "float", v);
    v.clear(), Put32(v, 0), Put32(v, 0), Attr(b, "screenWindowCenter", "v2f", v);
    v.clear(), Put32(v, 0x3f800000u), Attr(b, "screenWindowWidth", "float", v);
    if (deep) {
        const std::string type = "deepscanline";
        Attr(b, "type", "string", Bytes(type.begin(), type.end()));
        v.clear(), Put32(v, 1), Attr(b, "version", "int", v);
        v.clear(), Put32(v, static_cast<uint32_t>(lines)), Attr(b, "chunkCount", "int", v);
    }
    b.push_back(0);
    size_t bytesPerLine = 0;
    for (const Channel &c : channels) bytesPerLine += size_t(width) * (c.type == 1 ? 2 : 4);
    const size_t table = b.size();
    b.resize(table + 8 * size_t(lines));
    for (int i = 0; i < lines; ++i) {
        const uint64_t at = b.size();
        for (int k = 0; k < 8; ++k) b[table + 8 * i + k] = static_cast<uint8_t>(at >> (8 * k));
        Put32(b, static_cast<uint32_t>(data.y0 + i));
        if (deep) { // the sample counts' table, its size and the samples' size twice (64 bits each)
            for (uint32_t n : {uint32_t(width) * 4, 0u, uint32_t(bytesPerLine), 0u, uint32_t(bytesPerLine), 0u})
                Put32(b, n);
            for (int x = 1; x <= width; ++x) Put32(b, static_cast<uint32_t>(x));
        } else {
            Put32(b, static_cast<uint32_t>(bytesPerLine));
        }
        for (const Channel &c : channels)
            for (int x = data.x0; x <= data.x1; ++x) {
                const float f = value(x, data.y0 + i, c.name);
                const uint16_t h = FloatToHalf(f);
                if (c.type == 1) b.push_back(static_cast<uint8_t>(h)), b.push_back(static_cast<uint8_t>(h >> 8));
                if (c.type != 1) Put32(b, c.type == 0 ? static_cast<uint32_t>(f) : std::bit_cast<uint32_t>(f));
            }
    }
    return b;
}

const std::vector<Channel> kRGBA = {{"R", 1}, {"G", 1}, {"B", 1}, {"A", 1}};
int ChannelIndex(const std::string &n) { return n == "R" ? 0 : n == "G" ? 1 : n == "B" ? 2 : 3; }

/// Display (1,1)-(12,8), data (3,2)-(10,6): the image is 12 x 8 with data window x 2..10, y 2..7, image (x, y) being
/// file (x + 1, 8 - y).
const ImgRectI kDisplay(1, 1, 12, 8), kData(3, 2, 10, 6), kImageWindow(2, 2, 10, 7);
Bytes OffsetFile(int seed) {
    return HandMade(kDisplay, kData, kRGBA,
                    [seed](int x, int y, const std::string &c) { return Value(x + seed, y, ChannelIndex(c)); });
}
void ExpectOffsetFile(const Image &img, int seed) {
    EXPECT_EQ(std::pair(img.Width(), img.Height()), std::pair(12, 8));
    ASSERT_EQ(img.DataWindow(), kImageWindow);
    for (int y = kImageWindow.y0; y < kImageWindow.y1; ++y)
        for (int x = kImageWindow.x0; x < kImageWindow.x1; ++x) {
            const auto v = [&](int c) { return Value(x + 1 + seed, 8 - y, c); };
            ASSERT_EQ(img.GetFlt(x, y), (FltPixel{v(0), v(1), v(2), v(3)})) << x << "," << y;
        }
}

/// exrheader's data and display windows, part by part.
struct Windows {
    std::vector<ImgRectI> data, display; // inclusive max, as reported
};
Windows Exrheader(const std::string &path) {
    Windows w;
    const std::string text = CaptureText("exrheader '" + path + "'");
    const std::regex box(R"((dataWindow|displayWindow) \(type box2i\): \((-?\d+) (-?\d+)\) - \((-?\d+) (-?\d+)\))");
    for (std::sregex_iterator it(text.begin(), text.end(), box), end; it != end; ++it) {
        const ImgRectI r(std::stoi((*it)[2]), std::stoi((*it)[3]), std::stoi((*it)[4]), std::stoi((*it)[5]));
        ((*it)[1] == "dataWindow" ? w.data : w.display).push_back(r);
    }
    return w;
}
ImgRectI Flipped(const ImgRectI &data, const ImgRectI &display) {
    const int h = display.y1 - display.y0 + 1;
    return ImgRectI(data.x0 - display.x0, h - (data.y1 - display.y0) - 1, data.x1 - display.x0 + 1,
                    h - (data.y0 - display.y0));
}

/// The OpenEXR sample images: $ORVANE_TESTDATA, else the shared folder beside the source tree, else the workplace's
/// shared folder (a clone may live elsewhere).
std::string Samples() {
    if (const char *env = std::getenv("ORVANE_TESTDATA")) return std::string(env) + "/openexr-images";
    for (const char *root : {ORVANE_SOURCE_DIR "/../shared/testdata", "/work/shared/testdata"})
        if (std::filesystem::is_directory(std::string(root) + "/openexr-images"))
            return std::string(root) + "/openexr-images";
    return ORVANE_SOURCE_DIR "/../shared/testdata/openexr-images";
}

class OpenEXRFormatTest : public FormatSuite {};

TEST_F(OpenEXRFormatTest, RoundTripsEveryCompressionAndWindow) {
    const std::vector<ImgRectI> windows = {ImgRectI(0, 0, 37, 23), ImgRectI(-5, -3, 45, 30), ImgRectI(4, 6, 20, 17),
                                           ImgRectI(30, 18, 50, 40)};
    for (int depth : {DepthRGBAFlt16, DepthRGBAFlt32})
        for (int c = 0; c <= 9; ++c)
            for (const ImgRectI &window : windows) {
                SCOPED_TRACE(testing::Message() << "depth " << depth << " compression " << c << " window " << window.x0
                                                << "," << window.y0);
                // Lossless: None, RLE, both Zips, Piz, and Pxr24 and B44(A) on float32 (they keep FLOAT).
                const bool lossless = c <= 4 || (depth == DepthRGBAFlt32 && (c == 6 || c == 7));
                Ref<Image> src = Pattern(37, 23, depth, window, !lossless);
                const Bytes b = SaveWith(kId, src.Get(), {{"Compression", c}});
                const LoadResult r = Load(kId, b);
                ASSERT_TRUE(r.image) << r.error;
                EXPECT_EQ(r.image->Depth(), depth);
                const float tolerance = lossless ? 0.f : depth == DepthRGBAFlt32 && c == 5 ? 1e-4f : 0.02f;
                ExpectSamePixels(*src, *r.image, true, tolerance);
            }
}

TEST_F(OpenEXRFormatTest, SavesFromEveryDepthWithEveryDepthChoice) {
    if (!HaveProgram("exrheader")) GTEST_SKIP() << "exrheader is not installed";
    // Every image depth by Depth choice (Auto, float16, float32): the file's colour is half for float16, and for Auto
    // from int8 and float16 images; auxiliary channels are float but for float16; as exrheader reads them.
    TempDir dir;
    const ImgRectI window(2, 1, 9, 5); // 11 x 6 frame: file lines 1..4, columns 2..8
    for (int depth = DepthAInt8; depth <= DepthRGBAFlt32; ++depth)
        for (int mode = 0; mode < 3; ++mode) {
            SCOPED_TRACE(testing::Message() << "depth " << depth << " mode " << mode);
            const bool eightOrHalf =
                depth == DepthAInt8 || depth == DepthAFlt16 || depth == DepthRGBAInt8 || depth == DepthRGBAFlt16;
            const bool half = mode == 1 || (mode == 0 && eightOrHalf);
            Ref<Image> src =
                NewImageTagList({{ImgWidth, 11}, {ImgHeight, 6}, {ImgDepth, depth}, {ImgDataWindow, &window}});
            ASSERT_TRUE(src && src->AllocScanLineData() && src->AddAuxChannel(AuxChannelKind::Z));
            src->SetScale(2.0, 1.0);
            for (int y = window.y0; y < window.y1; ++y)
                for (int x = window.x0; x < window.x1; ++x) {
                    const float v = 0.013f * (x + 11 * y) + 0.001f;
                    src->PutFlt(x, y, {v, v / 2, 1 - v, 0.75f});
                    src->AuxRow(AuxChannelKind::Z, y)[x - window.x0] = 100.f + v;
                }
            const Bytes b = SaveWith(kId, src.Get(), {{"Depth", mode}});
            ASSERT_FALSE(b.empty());
            WriteFile(dir / "d.exr", b);
            const std::string header = CaptureText("exrheader '" + dir / "d.exr" + "'");
            for (const std::string &line :
                 std::vector<std::string>{std::string("R, ") + (half ? "16" : "32") + "-bit floating-point",
                                          std::string("Z, ") + (mode == 1 ? "16-bit" : "32-bit"),
                                          "dataWindow (type box2i): (2 1) - (8 4)", "pixelAspectRatio (type float): 2"})
                EXPECT_NE(header.find(line), std::string::npos) << line << " in " << header;
            const LoadResult r = Load(kId, b);
            ASSERT_TRUE(r.image) << r.error;
            EXPECT_EQ(r.image->Depth(), half ? DepthRGBAFlt16 : DepthRGBAFlt32);
            ASSERT_EQ(r.image->DataWindow(), window);
            auto stored = [half](float v) { return half ? HalfToFloat(FloatToHalf(v)) : v; };
            for (int y = window.y0; y < window.y1; ++y)
                for (int x = window.x0; x < window.x1; ++x) {
                    const FltPixel s = src->GetFlt(x, y); // a single channel reads into all four
                    ASSERT_EQ(r.image->GetFlt(x, y), (FltPixel{stored(s.R), stored(s.G), stored(s.B), stored(s.A)}))
                        << x << "," << y;
                    const float z = src->AuxRow(AuxChannelKind::Z, y)[x - window.x0];
                    ASSERT_EQ(r.image->AuxRow(AuxChannelKind::Z, y)[x - window.x0],
                              mode == 1 ? HalfToFloat(FloatToHalf(z)) : z);
                }
        }
}

TEST_F(OpenEXRFormatTest, AuxiliaryChannelsChannelBoxesAndMetadataWithTypes) {
    const ImgRectI window(-2, 1, 15, 9);
    Ref<Image> src = Pattern(13, 8, DepthRGBAFlt16, window);
    const AuxChannelKind kinds[] = {AuxChannelKind::Z, AuxChannelKind::VectorX, AuxChannelKind::BackVectorY,
                                    AuxChannelKind::Coverage};
    for (AuxChannelKind k : kinds) ASSERT_TRUE(src->AddAuxChannel(k));
    for (int y = window.y0; y < window.y1; ++y)
        for (int i = 0; i < 4; ++i)
            for (int x = 0; x < window.Width(); ++x) src->AuxRow(kinds[i], y)[x] = 1000.f * i + x * 0.1f + y / 3.f;
    ScriptVal &md = src->Metadata();
    ScriptVal types = ScriptVal::Table(), v2 = ScriptVal::Table("v2f"), box = ScriptVal::Table("box2i"),
              m = ScriptVal::Table("m44f"), names = ScriptVal::Table(), nested = ScriptVal::Table();
    types.Set("frameCount", ScriptVal("int")).Set("exactness", ScriptVal("double"));
    for (double d : {1.5, -2.0}) v2.Append(ScriptVal(d));
    for (double d : {-1.0, 2.0, 30.0, 40.0}) box.Append(ScriptVal(d));
    for (int i = 0; i < 16; ++i) m.Append(ScriptVal(i % 5 == 0 ? 1.0 : 0.0));
    names.Append(ScriptVal("left")).Append(ScriptVal("beauty"));
    nested.Set("Gamma", ScriptVal(2.2)); // no file form: left out
    md.Set("owner", ScriptVal("Test Studio")).Set("TimeCode", ScriptVal("01:02:03:04")).Set("Focus", ScriptVal(2.5));
    md.Set("aperture", ScriptVal(2.8)).Set("frameCount", ScriptVal(42)).Set("exactness", ScriptVal(0.1));
    md.Set("OpenEXRTypes", types).Set("offset", v2).Set("crop", box).Set("worldToCamera", m).Set("tags", names);
    md.Set("GammaSpace", nested);
    const Bytes b = SaveWith(kId, src.Get(), {{"SaveG", 0}, {"SaveYVel", 0}});
    if (HaveProgram("exrheader")) {
        TempDir dir;
        WriteFile(dir / "m.exr", b);
        const std::string text = CaptureText("exrheader '" + dir / "m.exr" + "'");
        for (const char *line : {"timeCode (type timecode)", "focus (type float): 2.5", "frameCount (type int): 42",
                                 "exactness (type double)", "crop (type box2i): (-1 2) - (30 40)",
                                 "worldToCamera (type m44f)", "tags (type stringvector)", "owner (type string)"})
            EXPECT_NE(text.find(line), std::string::npos) << line;
        EXPECT_EQ(text.find("GammaSpace"), std::string::npos);
    }
    const std::string text(b.begin(), b.end());
    for (const char *name : {"Z", "velX", "rvelY", "pixelCover"}) EXPECT_NE(text.find(name), std::string::npos);
    const LoadResult r = Load(kId, b);
    ASSERT_TRUE(r.image) << r.error;
    ASSERT_EQ(r.image->DataWindow(), window);
    for (int i = 0; i < 4; ++i) {
        ASSERT_TRUE(r.image->HasAuxChannel(kinds[i]));
        for (int y = window.y0; y < window.y1; ++y)
            ASSERT_EQ(0, std::memcmp(r.image->AuxRow(kinds[i], y), src->AuxRow(kinds[i], y), 4 * window.Width()));
    }
    EXPECT_FALSE(r.image->HasAuxChannel(AuxChannelKind::VectorY));
    const FltPixel p = r.image->GetFlt(3, 4), s = src->GetFlt(3, 4);
    EXPECT_EQ(p, (FltPixel{s.R, 0.f, s.B, s.A})); // G was not written and reads as 0
    const ScriptVal &got = r.image->Metadata();
    for (const char *key : {"owner", "TimeCode", "Focus", "frameCount", "exactness", "offset", "crop", "worldToCamera"})
        EXPECT_EQ(got.Find(key) ? *got.Find(key) : ScriptVal(), *md.Find(key)) << key;
    EXPECT_NEAR(got.Find("aperture")->AsNumber(), 2.8, 1e-6); // a float in the file
    ASSERT_TRUE(got.Find("tags"));
    EXPECT_EQ(got.Find("tags")->ClassName(), "stringvector");
    EXPECT_EQ(got.Find("tags")->At(2)->AsText(), "beauty");
    const ScriptVal *t = got.Find("OpenEXRTypes");
    ASSERT_TRUE(t);
    for (auto [key, type] :
         {std::pair{"frameCount", "int"}, {"exactness", "double"}, {"Focus", "float"}, {"TimeCode", "timecode"}})
        EXPECT_EQ(t->Find(key)->AsText(), type) << key;
}

TEST_F(OpenEXRFormatTest, HandMadeFilesReadToKnownValuesAndAreDescribedAsBuilt) {
    // Y alone: grey, opaque; FLOAT makes a float32 image.
    const Bytes grey = HandMade(ImgRectI(0, 0, 5, 3), ImgRectI(0, 0, 5, 3), {{"Y", 2}},
                                [](int x, int y, const std::string &) { return x * 0.25f - y / 3.f; });
    const auto value = [](int x, int, const std::string &c) { return c == "objectID" ? 7.f + x : 0.5f; };
    const Bytes uint =
        HandMade(ImgRectI(0, 0, 7, 4), ImgRectI(2, 1, 5, 3), {{"R", 1}, {"G", 2}, {"objectID", 0}}, value);
    const Bytes deep = HandMade(ImgRectI(0, 0, 7, 4), ImgRectI(2, 1, 5, 3), {{"Z", 2}, {"A", 1}}, value, true);
    struct Row {
        Bytes file;
        const char *readError, *type, *channels, *dataWindow, *displayWindow; // windows as the file holds them
        std::function<void(const Image &)> check;
    };
    const Row rows[] = {
        {OffsetFile(0), nullptr, "scanlineimage", "A half, B half, G half, R half", "{ 3, 2, 10, 6 }",
         "{ 1, 1, 12, 8 }",
         [](const Image &img) {
             EXPECT_EQ(img.Depth(), DepthRGBAFlt16);
             ExpectOffsetFile(img, 0);
         }},
        {grey, nullptr, "scanlineimage", "Y float", "{ 0, 0, 5, 3 }", "{ 0, 0, 5, 3 }",
         [](const Image &img) {
             EXPECT_EQ(img.Depth(), DepthRGBAFlt32);
             for (int y = 0; y < 4; ++y)
                 for (int x = 0; x < 6; ++x) {
                     const float v = x * 0.25f - (3 - y) / 3.f;
                     ASSERT_EQ(img.GetFlt(x, y), (FltPixel{v, v, v, 1.f}));
                 }
         }},
        {uint, nullptr, "scanlineimage", "G float, R half, objectID uint32", "{ 2, 1, 5, 3 }", "{ 0, 0, 7, 4 }",
         [](const Image &img) { // unsigned integers read as floats, in the image's flipped window
             ASSERT_EQ(img.DataWindow(), ImgRectI(2, 1, 6, 4));
             EXPECT_EQ(img.AuxRow(AuxChannelKind::ObjectID, 2)[3], 7.f + 5);
         }},
        {deep, "holds deep data", "deepscanline", "A half, Z float", "{ 2, 1, 5, 3 }", "{ 0, 0, 7, 4 }", nullptr},
    };
    for (const Row &row : rows) {
        SCOPED_TRACE(row.channels);
        Ref<ImageFormat> f = MakeFormat(kId);
        MemoryIO io(row.file);
        ScriptVal d;
        ASSERT_TRUE(f->DescribeFile(&io, d)) << f->Error();
        const std::string error = d.Find("readError") ? d.Find("readError")->AsText() : "";
        EXPECT_TRUE(row.readError ? error.find(row.readError) != std::string::npos : error.empty()) << error;
        EXPECT_EQ(d.Find("width") != nullptr, row.readError == nullptr);
        const ScriptVal &part = *d.Find("openexr")->Find("parts")->At(1);
        EXPECT_EQ(part.Find("type")->AsText(), row.type);
        EXPECT_EQ(part.Find("dataWindow")->ToText(), row.dataWindow);
        EXPECT_EQ(part.Find("displayWindow")->ToText(), row.displayWindow);
        std::string channels;
        for (const auto &[k, c] : d.Find("channels")->Entries())
            channels += (channels.empty() ? "" : ", ") + c.Find("name")->AsText() + " " + c.Find("type")->AsText();
        EXPECT_EQ(channels, row.channels);
        const LoadResult r = Load(kId, row.file);
        ASSERT_EQ(r.image != nullptr, row.check != nullptr) << r.error;
        if (row.check) row.check(*r.image);
    }
}

TEST_F(OpenEXRFormatTest, TiledMultiPartMultiViewAndLayeredFilesReadWhatIsChosen) {
    if (!HaveProgram("exrmaketiled") || !HaveProgram("exrmultipart") || !HaveProgram("exrmultiview"))
        GTEST_SKIP() << "the OpenEXR tools are not installed";
    TempDir dir;
    WriteFile(dir / "a.exr", OffsetFile(0));
    WriteFile(dir / "b.exr", OffsetFile(5));
    ASSERT_TRUE(RunShell("exrmaketiled -t 4 4 -z zip '" + dir / "a.exr" + "' '" + dir / "t.exr" + "'"));
    ASSERT_TRUE(RunShell("exrmultipart -combine -i '" + dir / "a.exr" + "::first' '" + dir / "b.exr" +
                         "::second' -o '" + dir / "p.exr" + "' >/dev/null"));
    // The right view is the file's default; the left eye is still read first.
    ASSERT_TRUE(RunShell("exrmultiview -z zip right '" + dir / "b.exr" + "' left '" + dir / "a.exr" + "' '" +
                         dir / "v.exr" + "'"));
    // Two colour layers, one with lower-case names, no alpha, and a channel no slot reads; pixel x of layer channel c
    // holds x + the layer's and the channel's offsets.
    std::vector<Channel> names;
    for (const char *n : {"beauty.r", "beauty.g", "beauty.b", "diffuse.R", "diffuse.G", "diffuse.B", "mask"})
        names.push_back({n, 1});
    const Bytes layered =
        HandMade(ImgRectI(0, 0, 3, 1), ImgRectI(0, 0, 3, 1), names, [](int x, int, const std::string &c) {
            const char last = static_cast<char>(std::toupper(static_cast<unsigned char>(c.back())));
            return (c[0] == 'd' ? 10.f : 0.f) + x + ChannelIndex(std::string(1, last)) / 4.f;
        });
    const std::map<std::string, Bytes> files = {{"tiled", ReadFile(dir / "t.exr")},
                                                {"parts", ReadFile(dir / "p.exr")},
                                                {"views", ReadFile(dir / "v.exr")},
                                                {"layers", layered}};
    // File, choices, eye, the OffsetFile read (layers: the layer's offset), or the failure expected instead.
    const std::tuple<const char *, Choices, int, int, const char *> rows[] = {
        {"tiled", {}, 0, 0, ""},
        {"parts", {}, 0, 0, ""},
        {"parts", {{"Part", "second"}}, 0, 5, ""},
        {"parts", {{"Part", "third"}}, 0, 0, "the file has no part third"},
        {"views", {}, 0, 0, ""},
        {"views", {}, 1, 5, ""},
        {"views", {{"View", "right"}}, 0, 5, ""},
        {"views", {{"View", "left"}}, 1, 0, ""}, // the choice outranks the eye
        {"views", {{"View", "centre"}}, 0, 0, "the file has no view centre"},
        {"layers", {}, 0, 0, ""},
        {"layers", {{"Layer", "diffuse"}}, 0, 10, ""},
        {"layers", {{"Layer", "specular"}}, 0, 0, "has no layer specular"},
    };
    for (const auto &[file, choices, eye, seed, failure] : rows) {
        SCOPED_TRACE(testing::Message() << file << " eye " << eye << " " << (choices.empty() ? "" : choices[0].second));
        std::string error;
        Ref<Image> img = LoadWith(kId, files.at(file), {}, choices, eye, &error);
        if (*failure) {
            EXPECT_TRUE(!img && error.find(failure) != std::string::npos) << error;
            continue;
        }
        ASSERT_TRUE(img) << error;
        if (std::string(file) != "layers") {
            ExpectOffsetFile(*img, seed);
            continue;
        }
        EXPECT_EQ(img->GetFlt(2, 0), (FltPixel{seed + 2.f, seed + 2.25f, seed + 2.5f, 1.f}));
    }

    // After a header, the lists offer the file's parts and views.
    for (auto [file, input, want] :
         {std::tuple{"parts", "Part", "Default first second "}, {"views", "View", "Default right left "}}) {
        Ref<ImageFormat> f = MakeFormat(kId);
        MemoryIO io(files.at(file));
        OrvaneDoc doc;
        Operator *tool = Orvane::Test::AddImageSource(doc, "Loader", nullptr);
        ASSERT_TRUE(f->LoadHeader(&io)) << f->Error();
        f->AddLoadInputs(tool);
        std::string ids;
        for (const TagItem *item : tool->FindInput(input)->Tags().FindAll(ListItemId))
            ids += std::string(item->AsID().Text()) + " ";
        EXPECT_EQ(ids, want);
    }
}

TEST_F(OpenEXRFormatTest, SampleImagesMatchExrheader) {
    if (!std::filesystem::is_directory(Samples())) GTEST_SKIP() << Samples() << " is absent";
    if (!HaveProgram("exrheader")) GTEST_SKIP() << "exrheader is not installed";
    int files = 0;
    for (const char *folder : {"DisplayWindow", "TestImages", "Chromaticities", "Beachball"})
        for (const auto &e : std::filesystem::directory_iterator(Samples() + "/" + folder)) {
            if (e.path().extension() != ".exr") continue;
            SCOPED_TRACE(e.path().string());
            const Windows w = Exrheader(e.path());
            ASSERT_FALSE(w.data.empty());
            const LoadResult r = Load(kId, ReadFile(e.path()));
            ASSERT_TRUE(r.image) << r.error;
            // Multi-part Beachball: the left eye's colour part, "rgba_left", is part 4.
            const size_t part = w.data.size() == 10 ? 4 : 0;
            const ImgRectI &display = w.display[part];
            EXPECT_EQ(std::pair(r.image->Width(), r.image->Height()),
                      std::pair(display.x1 - display.x0 + 1, display.y1 - display.y0 + 1));
            EXPECT_EQ(r.image->DataWindow(), Flipped(w.data[part], w.display[part]));
            ++files;
        }
    EXPECT_GE(files, 30);

    // Each eye of the single-part multi-view and the multi-part Beachball frame agree, and the two eyes differ.
    const Bytes singleFile = ReadFile(Samples() + "/Beachball/singlepart.0001.exr");
    const Bytes multiFile = ReadFile(Samples() + "/Beachball/multipart.0001.exr");
    auto differing = [](const Image &a, const Image &b) {
        const ImgRectI common = a.DataWindow() & b.DataWindow();
        EXPECT_FALSE(common.IsNull());
        int n = 0;
        for (int y = common.y0; y < common.y1; y += 7)
            for (int x = common.x0; x < common.x1; x += 7) n += !(a.GetFlt(x, y) == b.GetFlt(x, y));
        return n;
    };
    Ref<Image> eyes[2];
    for (int eye = 0; eye < 2; ++eye) {
        const char *view = eye ? "right" : "left";
        Ref<Image> single = LoadWith(kId, singleFile, {}, {{"View", view}});
        Ref<Image> multi = LoadWith(kId, multiFile, {}, {{"View", view}});
        ASSERT_TRUE(single && multi) << view;
        EXPECT_EQ(differing(*single, *multi), 0) << view;
        ASSERT_TRUE(multi->Metadata().Find("name"));
        EXPECT_EQ(multi->Metadata().Find("name")->AsText(), std::string("rgba_") + view);
        eyes[eye] = single;
    }
    EXPECT_GT(differing(*eyes[0], *eyes[1]), 100);

    // Luminance / chroma reads close to the RGB original.
    const LoadResult rgb = Load(kId, ReadFile(Samples() + "/Chromaticities/Rec709.exr"));
    const LoadResult yc = Load(kId, ReadFile(Samples() + "/Chromaticities/Rec709_YC.exr"));
    ASSERT_TRUE(rgb.image && yc.image) << yc.error;
    ASSERT_EQ(rgb.image->DataWindow(), yc.image->DataWindow());
    double sum = 0, n = 0;
    for (int y = 0; y < rgb.image->Height(); y += 3)
        for (int x = 0; x < rgb.image->Width(); x += 3) {
            const FltPixel a = rgb.image->GetFlt(x, y), b = yc.image->GetFlt(x, y);
            sum += std::fabs(a.R - b.R) + std::fabs(a.G - b.G) + std::fabs(a.B - b.B), n += 3;
        }
    EXPECT_LT(sum / n, 0.05);
}

TEST_F(OpenEXRFormatTest, DamagedFilesAndFullDisksFailWithTheLibrarysReason) {
    // Truncation and other damage of our own files: EveryFormatTest.cpp.
    Ref<Image> src = Pattern(40, 30, DepthRGBAFlt16, ImgRectI(0, 0, 40, 30));
    Ref<ImageFormat> f = MakeFormat(kId);
    f->SetupSave(nullptr, nullptr);
    LimitedIO full(int64_t(Save(kId, src.Get()).size()) / 2);
    EXPECT_FALSE(f->SaveHeader(&full, src.Get()) && f->SaveFrame(0, src.Get()));
    EXPECT_NE(f->Error().find("OpenEXR"), std::string::npos) << f->Error();

    // Headers stating sizes the library would set memory aside for before reading (found by fuzzing): refused at the
    // header.
    Bytes hugeValue = {'j', 0, 'j', 0}, hugeTiles, tiles;
    Put32(hugeValue, 0x7ffffff0u); // an attribute of an unknown type claiming 2 GB
    Put32(tiles, 32), Put32(tiles, 3022880), tiles.push_back(0);
    Attr(hugeTiles, "tiles", "tiledesc", tiles); // 770 MB a tile, on an 8 x 5 window
    for (auto [attribute, flags, error] :
         {std::tuple{hugeValue, 0, "attribute j claims 2147483632 bytes"},
          {hugeTiles, 0x02, "tiles of 32 x 3022880 are larger than the data window"}}) {
        Bytes file = OffsetFile(0);
        file[5] |= flags; // second byte of the version field: tiled
        file.insert(file.begin() + 8, attribute.begin(), attribute.end());
        const LoadResult r = Load(kId, file);
        EXPECT_FALSE(r.headerOk) << error;
        EXPECT_NE(r.error.find(error), std::string::npos) << r.error;
    }

    const std::string dir = Samples() + "/Damaged";
    if (!std::filesystem::is_directory(dir)) GTEST_SKIP() << dir << " is absent";
    int files = 0;
    for (const auto &e : std::filesystem::directory_iterator(dir)) {
        if (!e.is_regular_file()) continue;
        SCOPED_TRACE(e.path().filename().string());
        const LoadResult r = Load(kId, ReadFile(e.path()));
        EXPECT_FALSE(r.image);
        EXPECT_NE(r.error.find("OpenEXR"), std::string::npos) << r.error;
        ++files;
    }
    EXPECT_GT(files, 80);
}

/// A memory stream that counts the bytes read.
struct CountingIO : MemoryIO {
    using MemoryIO::MemoryIO;
    int64_t Read(void *buffer, int64_t bytes) override {
        const int64_t n = MemoryIO::Read(buffer, bytes);
        read += n;
        return n;
    }
    int64_t read = 0;
};

TEST_F(OpenEXRFormatTest, RegionsDecodeOnlyTheirRows) {
    const ImgRectI window(-3, 0, 64, 256);
    Ref<Image> src = Pattern(64, 256, DepthRGBAFlt16, window);
    const Bytes b = SaveWith(kId, src.Get(), {{"Compression", 1}});
    for (const ImgRectI &rect : {ImgRectI(-10, 100, 70, 116), ImgRectI(5, 7, 30, 20), ImgRectI(100, 0, 120, 9)}) {
        SCOPED_TRACE(testing::Message() << rect.x0 << "," << rect.y0 << " " << rect.x1 << "," << rect.y1);
        Ref<ImageFormat> f = MakeFormat(kId);
        f->SetupLoad(nullptr, nullptr);
        CountingIO io(b);
        ASSERT_TRUE(f->LoadHeader(&io));
        const int64_t header = io.read;
        const ImageDomain region(rect);
        Ref<Image> img;
        ASSERT_TRUE(f->LoadFrameTagList(0, img, {{ClipFrameRegion, &region}})) << f->Error();
        const ImgRectI want = rect & window;
        ASSERT_EQ(img->DataWindow(), want);
        EXPECT_LT(io.read - header, static_cast<int64_t>(b.size()) / 8);
        if (!want.IsNull()) ExpectSameRows(*src, *img, want);
    }
}

TEST_F(OpenEXRFormatTest, DisplayOptionsFollowTheirFormula) {
    Ref<Image> src = Pattern(4, 2, DepthRGBAFlt32, ImgRectI(0, 0, 4, 2));
    const float low = 0.05f, knee = static_cast<float>(32.0 / std::exp2(1 + 2.47393));
    src->PutFlt(0, 0, {low, 0.f, -1.f, 0.5f});
    src->PutFlt(1, 0, {knee, knee, knee, 1.f});
    const Bytes b = SaveWith(kId, src.Get(), {});
    // Defaults (and Bypass over any setting) leave every value as stored.
    for (const Options &o : {Options{}, Options{{"Bypass", 1}, {"Exposure", 3}, {"Defog", 0.01}}}) {
        Ref<Image> same = LoadWith(kId, b, o);
        ASSERT_TRUE(same);
        ExpectSamePixels(*src, *same);
    }
    Ref<Image> lit = LoadWith(kId, b, {{"Exposure", 1}});
    ASSERT_TRUE(lit);
    const double gain = std::pow(2.0, 1 + 2.47393) * 0.184874;
    EXPECT_NEAR(lit->GetFlt(0, 0).R, low * gain, 1e-6);
    EXPECT_EQ(lit->GetFlt(0, 0).B, 0.f);                                   // negatives clip at 0
    EXPECT_EQ(lit->GetFlt(0, 0).A, 0.5f);                                  // alpha untouched
    EXPECT_NEAR(lit->GetFlt(1, 0).G, std::pow(2.0, 3.5) * 0.184874, 1e-4); // 2^kneeHigh lands on 2^3.5
    Ref<Image> fog = LoadWith(kId, b, {{"Defog", 0.01}});
    ASSERT_TRUE(fog);
    EXPECT_NEAR(fog->GetFlt(0, 0).R, (low - 0.01) * std::pow(2.0, 2.47393) * 0.184874, 1e-6);
}

} // namespace exrtest_detail
} // namespace Orvane
