// EXRIO from trusted scripts: a two-part file a script writes, read back by the OpenEXR library; a file the
// library writes, read by a script; and the failures a script can cause.
#include <gtest/gtest.h>

#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfInputPart.h>
#include <ImfIntAttribute.h>
#include <ImfMultiPartInputFile.h>
#include <ImfMultiPartOutputFile.h>
#include <ImfOutputPart.h>
#include <ImfPartType.h>
#include <ImfStandardAttributes.h>
#include <ImfStringVectorAttribute.h>
#include <ImfVecAttribute.h>

#include <Imath/half.h>

#include <cmath>
#include <filesystem>
#include <fstream>

#include "host/script/ScriptClasses.h"
#include "host/script/ScriptState.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

/// A trusted state with the script classes of the tool library.
struct TrustedScript {
    ScriptState state;
    TrustedScript() {
        Orvane::Test::LoadOperators();
        EXPECT_EQ(InstallScriptClasses(state), "");
    }
    std::string Run(const std::string &text) { return state.Run(ScriptEnv::Trusted, text, "test"); }
    double Number(const std::string &name) { return state.GetNumber(ScriptEnv::Trusted, name.c_str(), NAN); }
};

/// The file box of an image rectangle (rows from the bottom) in a display window `h` rows high.
Imath::Box2i FileBox(int x0, int y0, int x1, int y1, int h) { return {{x0, h - y1}, {x1 - 1, h - y0 - 1}}; }

TEST(EXRIO, ScriptWritesTwoNamedPartsThatTheLibraryReads) {
    Orvane::Test::TempDir dir;
    TrustedScript s;
    s.state.SetString(ScriptEnv::Trusted, "path", dir / "two.exr");
    ASSERT_EQ(s.Run(R"(
        local w, h = 6, 4
        local img = Image.New(w, h, 8)
        local pp, p = PixPtr(img), FltPixel()
        for y = 0, h - 1 do for x = 0, w - 1 do
            pp:GotoXY(x, y); p.R, p.G, p.B, p.A = x + y / 8, 100 + x * y, -x, 1; pp:SetPixel(p)
        end end
        local f = EXRIO.__new()
        f:WriteOpen(path, -1)
        local disp = ffi.new("ImgRectI", {0, 0, w, h})
        assert(f:Part("beauty", disp, disp, 1.0) == 1)
        f:Channel("R", EXRIO.FLOAT, 1, 0)
        f:Channel("G", EXRIO.HALF, 1, 1)
        assert(f:Part("depth", disp, ffi.new("ImgRectI", {2, 1, 5, 3}), 1.0) == 2)
        f:Channel("Z", EXRIO.FLOAT, img, 2)
        assert(f:SetAttribute(2, "compression", EXRIO.PIZ_COMPRESSION))
        assert(f:SetAttribute(1, "lens", {1.5, 2.5}))
        assert(f:SetAttribute(1, "tags", {"a", "b"}))
        assert(f:SetAttribute(1, "shots", 7, "int"))
        assert(not f:SetAttribute(1, "shots", "seven"))
        assert(f:WriteHeader(), f:GetLastError())
        assert(f:WritePart(1, {img}), f:GetLastError())
        assert(f:WritePart(2), f:GetLastError())
        assert(f:Close())
    )"),
              "");

    const int w = 6, h = 4;
    Imf::MultiPartInputFile in((dir / "two.exr").c_str());
    ASSERT_EQ(in.parts(), 2);
    const Imf::Header &beauty = in.header(0), &depth = in.header(1);
    EXPECT_EQ(beauty.name(), "beauty");
    EXPECT_EQ(depth.name(), "depth");
    EXPECT_EQ(beauty.type(), Imf::SCANLINEIMAGE);
    EXPECT_EQ(beauty.dataWindow(), FileBox(0, 0, w, h, h));
    EXPECT_EQ(depth.displayWindow(), FileBox(0, 0, w, h, h));
    EXPECT_EQ(depth.dataWindow(), FileBox(2, 1, 5, 3, h));
    EXPECT_EQ(depth.compression(), Imf::PIZ_COMPRESSION);
    EXPECT_EQ(beauty.channels().findChannel("G")->type, Imf::HALF);
    EXPECT_EQ(beauty.typedAttribute<Imf::V2fAttribute>("lens").value(), Imath::V2f(1.5f, 2.5f));
    EXPECT_EQ(beauty.typedAttribute<Imf::StringVectorAttribute>("tags").value(), (std::vector<std::string>{"a", "b"}));
    EXPECT_EQ(beauty.typedAttribute<Imf::IntAttribute>("shots").value(), 7);

    std::vector<float> r(w * h), z(w * h, -99.f);
    std::vector<Imath::half> g(w * h);
    Imf::FrameBuffer fb0, fb1;
    fb0.insert("R", Imf::Slice(Imf::FLOAT, reinterpret_cast<char *>(r.data()), 4, 4 * w));
    fb0.insert("G", Imf::Slice(Imf::HALF, reinterpret_cast<char *>(g.data()), 2, 2 * w));
    Imf::InputPart p0(in, 0);
    p0.setFrameBuffer(fb0);
    p0.readPixels(0, h - 1);
    fb1.insert("Z", Imf::Slice(Imf::FLOAT, reinterpret_cast<char *>(z.data()), 4, 4 * w));
    Imf::InputPart p1(in, 1);
    p1.setFrameBuffer(fb1);
    p1.readPixels(depth.dataWindow().min.y, depth.dataWindow().max.y);
    const Imath::Box2i dz = depth.dataWindow();
    for (int fy = 0; fy < h; ++fy)
        for (int x = 0; x < w; ++x) {
            const int y = h - 1 - fy, i = fy * w + x;
            EXPECT_FLOAT_EQ(r[i], x + y / 8.f) << x << "," << fy;
            EXPECT_EQ(float(g[i]), float(Imath::half(100.f + x * y))) << x << "," << fy;
            const bool inside = dz.intersects(Imath::V2i(x, fy));
            EXPECT_FLOAT_EQ(z[i], inside ? -x : -99.f) << x << "," << fy;
        }
}

TEST(EXRIO, ScriptReadsPartsTheLibraryWrote) {
    Orvane::Test::TempDir dir;
    const int w = 5, h = 3;
    const Imath::Box2i full({0, 0}, {w - 1, h - 1}), window({1, 0}, {3, 1});
    {
        Imf::Header a(full, full), b(full, window);
        a.setName("a"), b.setName("b");
        a.setType(Imf::SCANLINEIMAGE), b.setType(Imf::SCANLINEIMAGE);
        a.channels().insert("R", Imf::Channel(Imf::HALF));
        b.channels().insert("Z", Imf::Channel(Imf::FLOAT));
        const Imf::Header headers[] = {a, b};
        Imf::MultiPartOutputFile out((dir / "lib.exr").c_str(), headers, 2);
        std::vector<Imath::half> rv(w * h);
        std::vector<float> zv(w * h);
        for (int fy = 0; fy < h; ++fy)
            for (int x = 0; x < w; ++x) rv[fy * w + x] = Imath::half(x * 0.5f + fy), zv[fy * w + x] = 10.f * x + fy;
        Imf::FrameBuffer fa, fbz;
        fa.insert("R", Imf::Slice(Imf::HALF, reinterpret_cast<char *>(rv.data()), 2, 2 * w));
        fbz.insert("Z", Imf::Slice(Imf::FLOAT, reinterpret_cast<char *>(zv.data()), 4, 4 * w));
        Imf::OutputPart pa(out, 0), pb(out, 1);
        pa.setFrameBuffer(fa);
        pa.writePixels(h);
        pb.setFrameBuffer(fbz);
        pb.writePixels(2);
    }
    TrustedScript s;
    s.state.SetString(ScriptEnv::Trusted, "path", dir / "lib.exr");
    ASSERT_EQ(s.Run(R"(
        local f = EXRIO.__new()
        f:ReadOpen(path, -1)
        assert(f:ReadHeader(), f:GetLastError())
        nparts, bpart = f.NumParts, f:FindPart("b")
        local dw = f:DataWindow(bpart)
        dx0, dy0, dx1, dy1 = dw.x0, dw.y0, dw.x1, dw.y1
        local img = Image.New(5, 3, 8)
        f:Part(1)
        f:Channel("R", EXRIO.ANY_TYPE, 1, 0)
        f:Channel("nothere", EXRIO.FLOAT, 1, 3, 0.75)
        assert(f:ReadPart(1, {img}), f:GetLastError())
        f:Part(bpart)
        f:Channel("Z", EXRIO.ANY_TYPE, img, 1)
        assert(f:ReadPart(bpart), f:GetLastError())
        local pp, p = PixPtr(img), FltPixel()
        for y = 0, 2 do for x = 0, 4 do
            pp:GotoXY(x, y); pp:GetPixel(p)
            _G["r" .. x .. y], _G["g" .. x .. y], _G["a" .. x .. y] = p.R, p.G, p.A
        end end
        f:Close()
    )"),
              "");
    EXPECT_EQ(s.Number("nparts"), 2);
    EXPECT_EQ(s.Number("bpart"), 2);
    // File rows 0..1 of 3 are image rows 1..2.
    EXPECT_EQ((std::vector<double>{s.Number("dx0"), s.Number("dy0"), s.Number("dx1"), s.Number("dy1")}),
              (std::vector<double>{1, 1, 4, 3}));
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const int fy = h - 1 - y;
            const std::string at = std::to_string(x) + std::to_string(y);
            EXPECT_EQ(s.Number("r" + at), float(Imath::half(x * 0.5f + fy))) << at;
            EXPECT_EQ(s.Number("g" + at), window.intersects(Imath::V2i(x, fy)) ? 10.0 * x + fy : 0.0) << at;
            EXPECT_EQ(s.Number("a" + at), 0.75) << at;
        }
}

TEST(EXRIO, FailuresAndEdgesLeaveCleanResults) {
    Orvane::Test::TempDir dir;
    {
        Imf::Header hd(4, 2);
        hd.setType(Imf::SCANLINEIMAGE);
        hd.channels().insert("R", Imf::Channel(Imf::FLOAT));
        Imf::MultiPartOutputFile out((dir / "good.exr").c_str(), &hd, 1);
        std::vector<float> v(8, 0.25f);
        Imf::FrameBuffer fb;
        fb.insert("R", Imf::Slice(Imf::FLOAT, reinterpret_cast<char *>(v.data()), 4, 16));
        Imf::OutputPart p(out, 0);
        p.setFrameBuffer(fb);
        p.writePixels(2);
    }
    std::ifstream good(dir / "good.exr", std::ios::binary);
    const std::string bytes{std::istreambuf_iterator<char>(good), {}};
    std::ofstream(dir / "cut.exr", std::ios::binary) << bytes.substr(0, bytes.size() - 12);
    std::ofstream(dir / "junk.exr", std::ios::binary) << "not an image at all, just text";

    struct Case {
        const char *what, *lua, *want;
    } cases[] = {
        {"an unknown part name", "f:ReadOpen(good, -1) f:ReadHeader() result = f:FindPart('nope')", "0"},
        {"frame -1 keeps the name",
         "f:ReadOpen(dir .. '/x.####.exr', -1) f:ReadHeader() result = tostring("
         "f:GetLastError():find('x.####.exr', 1, true) ~= nil)",
         "true"},
        {"frame 12 is put into the name",
         "f:ReadOpen(dir .. '/x.####.exr', 12) f:ReadHeader() result = "
         "tostring(f:GetLastError():find('x.0012.exr', 1, true) ~= nil)",
         "true"},
        {"a channel of another type is skipped",
         "f:ReadOpen(good, -1) f:ReadHeader() f:Part(1) f:Channel('R', EXRIO.HALF, img, 0) "
         "result = tostring(f:ReadPart(1)) .. ' ' .. at(1, 1)",
         "true 0.5"},
        {"the file's type reads",
         "f:ReadOpen(good, -1) f:ReadHeader() f:Part(1) f:Channel('R', EXRIO.FLOAT, img, 0) "
         "result = tostring(f:ReadPart(1)) .. ' ' .. at(1, 1)",
         "true 0.25"},
        {"close before any open", "result = tostring(f:Close())", "true"},
        {"a file that is no image", "f:ReadOpen(junk, -1) result = failed(f:ReadHeader())", "false error"},
        {"a cut file",
         "f:ReadOpen(cut, -1) local ok = f:ReadHeader() if ok then f:Part(1) "
         "f:Channel('R', EXRIO.FLOAT, img, 0) ok = f:ReadPart(1) end result = failed(ok)",
         "false error"},
        {"a part past the last", "f:ReadOpen(good, -1) f:ReadHeader() result = failed(f:ReadPart(3))", "false error"},
        {"writing before the header", "f:WriteOpen(dir .. '/w.exr', -1) result = failed(f:WritePart(1))",
         "false error"},
        {"an unknown attribute", "f:ReadOpen(good, -1) f:ReadHeader() result = tostring(f:GetAttribute(1, 'nope'))",
         "nil"},
        {"cast and uncast", "result = tostring(EXRIO.cast(EXRIO.uncast(f)) == f)", "true"},
    };
    for (const Case &c : cases) {
        TrustedScript s;
        s.state.SetString(ScriptEnv::Trusted, "dir", dir.path);
        const std::string prelude =
            "local good, cut, junk = dir .. '/good.exr', dir .. '/cut.exr', dir .. '/junk.exr'\n"
            "local f, img = EXRIO.__new(), Image.New(4, 2, 8)\n"
            "local pp, p = PixPtr(img), FltPixel()\n"
            "for y = 0, 1 do for x = 0, 3 do pp:GotoXY(x, y) p.R = 0.5 pp:SetPixel(p) end end\n"
            "local function at(x, y) pp:GotoXY(x, y) pp:GetPixel(p) return p.R end\n"
            "local function failed(ok) return tostring(ok) .. "
            "(#f:GetLastError() > 0 and ' error' or '') end\n";
        ASSERT_EQ(s.Run(prelude + c.lua), "") << c.what;
        s.state.SetString(ScriptEnv::Trusted, "want", c.want);
        EXPECT_EQ(s.Run("assert(tostring(result) == want, tostring(result))"), "") << c.what;
    }
}

} // namespace
} // namespace Orvane
