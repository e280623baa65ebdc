#include "operators/modifier/CustomScript.h"

#include <fmt/format.h>

#include "host/script/Parser.h"

namespace Orvane {
namespace {

enum class Proxy { None, X, Y };
enum class Clamp { None, OnIntegerOutput, Always };

struct ChannelRow {
    const char *field, *label;
    Proxy proxy;
    Clamp clamp;
};

constexpr ChannelRow kChannels[kCustomChannels] = {
    {"R", "Red", Proxy::None, Clamp::OnIntegerOutput},
    {"G", "Green", Proxy::None, Clamp::OnIntegerOutput},
    {"B", "Blue", Proxy::None, Clamp::OnIntegerOutput},
    {"A", "Alpha", Proxy::None, Clamp::OnIntegerOutput},
    {"Z", "Z", Proxy::None, Clamp::None},
    {"Coverage", "Z Coverage", Proxy::None, Clamp::Always},
    {"U", "U", Proxy::None, Clamp::None},
    {"V", "V", Proxy::None, Clamp::None},
    {"NX", "X Normal", Proxy::None, Clamp::None},
    {"NY", "Y Normal", Proxy::None, Clamp::None},
    {"NZ", "Z Normal", Proxy::None, Clamp::None},
    {"VectX", "X Vector", Proxy::X, Clamp::None},
    {"VectY", "Y Vector", Proxy::Y, Clamp::None},
    {"BackVectX", "X Back Vector", Proxy::X, Clamp::None},
    {"BackVectY", "Y Back Vector", Proxy::Y, Clamp::None},
    {"PositionX", "X Position", Proxy::None, Clamp::None},
    {"PositionY", "Y Position", Proxy::None, Clamp::None},
    {"PositionZ", "Z Position", Proxy::None, Clamp::None},
    {"DisparityX", "X Disparity", Proxy::X, Clamp::None},
    {"DisparityY", "Y Disparity", Proxy::Y, Clamp::None},
};

/// Sampler accessors: the name between "get" and the edge letter, the pixel field, and the proxy factor.
struct SamplerRow {
    const char *key, *field;
    Proxy proxy;
};
constexpr SamplerRow kSamplers[] = {
    {"r", "R", Proxy::None},          {"g", "G", Proxy::None},          {"b", "B", Proxy::None},
    {"a", "A", Proxy::None},          {"bgr", "BgR", Proxy::None},      {"bgg", "BgG", Proxy::None},
    {"bgb", "BgB", Proxy::None},      {"bga", "BgA", Proxy::None},      {"z", "Z", Proxy::None},
    {"cov", "Coverage", Proxy::None}, {"u", "U", Proxy::None},          {"v", "V", Proxy::None},
    {"nx", "NX", Proxy::None},        {"ny", "NY", Proxy::None},        {"nz", "NZ", Proxy::None},
    {"px", "PositionX", Proxy::None}, {"py", "PositionY", Proxy::None}, {"pz", "PositionZ", Proxy::None},
    {"vx", "VectX", Proxy::X},        {"vy", "VectY", Proxy::Y},        {"bx", "BackVectX", Proxy::X},
    {"by", "BackVectY", Proxy::Y},    {"dx", "DisparityX", Proxy::X},   {"dy", "DisparityY", Proxy::Y},
};

constexpr const char *kEdges = "bwdm";
constexpr const char *kEdgeMethods = "BWDM";

const char *ProxyFactor(Proxy p, const char *x, const char *y) { return p == Proxy::X ? x : p == Proxy::Y ? y : ""; }

std::string Preamble() {
    std::string t = "jit.flush()\njit.opt.start(\"loopunroll=50\", \"maxirconst=1000\")\n"
                    "local min,max = math.min,math.max\n";
    // The template's own variables are locals of the chunk (upvalues of its functions): cheaper than globals.
    t += "local p0, p1, p2, p3, p4, temppix, cpix1, cpix2, cpix3, cpix4, pixsize\n"
         "local pp0, pp1, pp2, pp3, pp4, xpos, ypos, _w, _h, _ax, _ay\n"
         "local _w1, _h1, _ax1, _ay1, _w2, _h2, _ax2, _ay2, _w3, _h3, _ax3, _ay3, _wm, _hm, _axm, _aym\n";
    t += Parser::LuaPrelude();
    t += "local function _lut(k, v) return _lutfn(self, k, v) end\n";
    for (int e = 0; e < 4; ++e)
        t +=
            fmt::format("local function getchan{}fn(img, x, y, chan)\n"
                        "\tif img then img:SamplePixel{}(x*img.Width, y*img.Height, temppix) return temppix[chan] end\n"
                        "\treturn 0.0\nend\n",
                        kEdges[e], kEdgeMethods[e]);
    for (const SamplerRow &s : kSamplers)
        for (int e = 0; e < 4; ++e)
            t += fmt::format("local function get{}{}fn(img, x, y) return getchan{}fn(img, x, y, \"{}\"){} end\n", s.key,
                             kEdges[e], kEdges[e], s.field, ProxyFactor(s.proxy, " * proxy_x", " * proxy_y"));
    return t;
}

/// The image's global name ("img1", "img4" for the mask) and its suffix in size names ("1", "m").
std::string ImageName(int k) { return fmt::format("img{}", k); }
std::string SizeSuffix(int k) { return k == 4 ? "m" : std::to_string(k); }

} // namespace

CustomScript GenerateCustomScript(const CustomScriptInput &in) {
    CustomScript out;
    Parser parser;
    // One expression as Lua text: its translation, or "0" with the error noted.
    auto translate = [&](const std::string &text, ExpressionContext context, const std::string &label) {
        if (text.find_first_not_of(" \t\r\n") == std::string::npos) return std::string("0");
        std::string lua;
        ParseError error;
        if (parser.Parse(text, context, &lua, &error, &in.aliases)) return lua;
        out.errors.push_back(fmt::format("{} expression, {}", label, error.Describe()));
        return std::string("0");
    };

    std::string &t = out.text;
    t = Preamble();

    // initfunc
    t += "\n\t\t\tfunction initfunc()\n"
         "p0, p1, p2, p3, p4, temppix = FltPixel(), FltPixel(), FltPixel(), FltPixel(), FltPixel(), FltPixel()\n"
         "p0:Clear() p1:Clear() p2:Clear() p3:Clear() p4:Clear() temppix:Clear()\n"
         "cpix1, cpix2, cpix3, cpix4 = FltPixel(), FltPixel(), FltPixel(), FltPixel()\n"
         "pp0 = PixPtr(out, p0)\n"
         "_w = out.Width _h = out.Height _ax = out.XScale _ay = out.YScale\n"
         "pixsize = ffi.sizeof(\"FltPixel\")\n"
         "math.randomseed(bit.bxor(((time + 11.894635213132) * 277.456541671867416841684 * 134.5) % 9999.0, "
         "_seed));\n";
    for (int k = 1; k <= 4; ++k) {
        const bool present = in.images[k - 1];
        const std::string img = ImageName(k), n = SizeSuffix(k);
        for (const auto &[size, field] :
             {std::pair{"_w", "Width"}, {"_h", "Height"}, {"_ax", "XScale"}, {"_ay", "YScale"}})
            t += present ? fmt::format("{}{} = {}.{}\n", size, n, img, field) : fmt::format("{}{} = 0\n", size, n);
    }
    for (int k = 1; k <= 4; ++k) {
        const std::string img = ImageName(k);
        t += in.images[k - 1] ? fmt::format("pp{0} = PixPtr({1}, p{0})\n", k, img) : fmt::format("p{}:Clear()\n", k);
        t += in.images[k - 1] ? fmt::format("{}:GetCanvasColorFlt(cpix{})\n", img, k)
                              : fmt::format("cpix{}:Clear()\n", k);
    }
    for (int k = 1; k <= 8; ++k)
        t += fmt::format("s{} = ({})\n", k,
                         translate(in.setup[k - 1], ExpressionContext::Setup, fmt::format("Setup {}", k)));
    t += "\n\t\t\tend\n\t\t\t";

    // pixfunc
    t += "\n\t\t\tfunction pixfunc(_y)\n\t\t\t\tlocal c1,c2,c3\n\t\t\t";
    t += "local i1, i2, i3, i4, i5, i6, i7, i8\n";
    for (int k = 1; k <= 8; ++k)
        t +=
            fmt::format("i{} = ({})\n", k,
                        translate(in.intermediate[k - 1], ExpressionContext::Pixel, fmt::format("Intermediate {}", k)));
    for (int c = 0; c < kCustomChannels; ++c) {
        if (!(in.outputChannels & (1u << c))) continue;
        const ChannelRow &ch = kChannels[c];
        const char *proxy = ProxyFactor(ch.proxy, " * proxy_x", " * proxy_y");
        const char *unproxy = ProxyFactor(ch.proxy, " * unproxy_x", " * unproxy_y");
        t += fmt::format("c1,c2,c3 = p1.{0}{1},p2.{0}{1},p3.{0}{1}\n", ch.field, proxy);
        const std::string expr = translate(in.channel[c], ExpressionContext::Pixel, ch.label);
        const bool clamp = ch.clamp == Clamp::Always || (ch.clamp == Clamp::OnIntegerOutput && in.integerOutput);
        t += clamp ? fmt::format("p0.{} = min(1, max(0, ({}){}))\n", ch.field, expr, unproxy)
                   : fmt::format("p0.{} = ({}){}\n", ch.field, expr, unproxy);
    }
    t += "end\n";

    // chunkfunc
    t += "\n\t\t\tfunction chunkfunc(_y)\n\t\t\t\tpp0:GotoXY(dw0_left, _y)\n"
         "math.randomseed(bit.bxor(((time + 13.894635213132) * 357.456541671867416841684 * _y) % 9999.0, _seed));\n";
    // The line's windows in locals, read once per line rather than per pixel.
    for (int k = 1; k <= 4; ++k)
        if (in.images[k - 1])
            t += fmt::format("local dw{0}_left, dw{0}_right, dw{0}_bottom, dw{0}_top = "
                             "dw{0}_left, dw{0}_right, dw{0}_bottom, dw{0}_top\n",
                             k);
    for (int k = 1; k <= 4; ++k)
        if (in.images[k - 1])
            t += fmt::format("if dw{0}_right > dw{0}_left and _y >= dw{0}_bottom and _y < dw{0}_top then "
                             "pp{0}:GotoXY(dw{0}_left, _y) end\n",
                             k);
    t += "ypos = _y/_h\nfor _x = dw0_left,dw0_right-1 do\nxpos = _x/_w\n";
    for (int k = 1; k <= 4; ++k)
        if (in.images[k - 1])
            t += fmt::format("if _x >= dw{0}_left and _x < dw{0}_right and _y >= dw{0}_bottom and _y < dw{0}_top then "
                             "pp{0}:GetNextPixel(p{0}) else ffi.copy(p{0}, cpix{0}, pixsize) end\n",
                             k);
    t += "pixfunc(_y)\npp0:SetNextPixel(p0)\nend\nend\n";
    out.flags = parser.GetFlags();
    return out;
}

} // namespace Orvane
