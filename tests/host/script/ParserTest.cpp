#include "host/script/Parser.h"

#include <gtest/gtest.h>
#include <lua.hpp>

#include <algorithm>
#include <cmath>
#include <numbers>
#include <string>

namespace Orvane::parser_test {
namespace {

using namespace ExpressionFlags;
using Ctx = ExpressionContext;

// Stand-ins for what a script around the expressions provides, with values the tests below work out by hand:
// channel i (counted from 0 in the order R G B A BgR BgG BgB BgA Z Coverage U V NX NY NZ VectX VectY BackVectX
// BackVectY PositionX PositionY PositionZ DisparityX DisparityY) of image k is k + i/100; a sampler of image k,
// channel i and edge e (b w d m from 0) at (x, y) gives 1000k + 10i + e + x/2 + y/4. The chunk runs with this table
// as its only globals; reading or writing any other global raises an error.
constexpr const char *environmentSetup = R"(
local fields = {"R", "G", "B", "A", "BgR", "BgG", "BgB", "BgA", "Z", "Coverage", "U", "V", "NX", "NY", "NZ",
  "VectX", "VectY", "BackVectX", "BackVectY", "PositionX", "PositionY", "PositionZ", "DisparityX", "DisparityY"}
local keys = {"r", "g", "b", "a", "bgr", "bgg", "bgb", "bga", "z", "cov", "u", "v", "nx", "ny", "nz",
  "vx", "vy", "bx", "by", "px", "py", "pz", "dx", "dy"}
local env = {math = {}, xpos = 0.25, ypos = 0.75, time = 12, _w = 1920, _h = 1080, _ax = 1, _ay = 1}
for name, f in pairs(math) do env.math[name] = f end
for k = 1, 9 do
  env["n" .. k], env["s" .. k], env["i" .. k] = k + 0.5, -k, k * k
  env["p" .. k .. "x"], env["p" .. k .. "y"], env["p" .. k .. "z"] = 10 * k, 10 * k + 1, 10 * k + 2
end
for k = 1, 3 do
  env["img" .. k], env["c" .. k] = k, k / 10
  env["_w" .. k], env["_h" .. k], env["_ax" .. k], env["_ay" .. k] = 640 * k, 480 * k, 1, 2
  local pixel = {}
  for i, field in ipairs(fields) do pixel[field] = k + (i - 1) / 100 end
  env["p" .. k] = pixel
end
for i, key in ipairs(keys) do
  for e, edge in ipairs({"b", "w", "d", "m"}) do
    env["get" .. key .. edge .. "fn"] = function(img, x, y)
      return 1000 * img + 10 * (i - 1) + (e - 1) + x / 2 + y / 4
    end
  end
end
env._lut = function(k, v) return k * v * v end
env._numat = function(k, t) return 100 * k + t end
env._ptxat = function(k, t) return 1000 * k + t end
env._ptyat = function(k, t) return -1000 * k - t end
setmetatable(env, {__index = function(_, name) error("global " .. name .. " read", 2) end,
                   __newindex = function(_, name) error("global " .. name .. " written", 2) end})
sandbox = env
)";

class ParserTest : public ::testing::Test {
protected:
    void SetUp() override {
        lua_ = luaL_newstate();
        luaL_openlibs(lua_);
        ASSERT_EQ(luaL_dostring(lua_, environmentSetup), 0) << lua_tostring(lua_, -1);
    }
    void TearDown() override { lua_close(lua_); }

    // Translates and runs `text`; NaN with a failure when either step fails.
    double Evaluate(const std::string &text, Ctx context = Ctx::Pixel) {
        std::string lua;
        ParseError error;
        if (!parser_.Parse(text, context, &lua, &error)) {
            ADD_FAILURE() << text << ": " << error.Describe();
            return NAN;
        }
        const std::string chunk = Parser::LuaPrelude() + "return " + lua;
        lua_settop(lua_, 0);
        if (luaL_loadbuffer(lua_, chunk.data(), chunk.size(), "expression") == 0) {
            lua_getglobal(lua_, "sandbox");
            lua_setfenv(lua_, -2);
            if (lua_pcall(lua_, 0, 1, 0) == 0 && lua_type(lua_, -1) == LUA_TNUMBER) return lua_tonumber(lua_, -1);
        }
        ADD_FAILURE() << text << " -> " << lua << ": "
                      << (lua_isstring(lua_, -1) ? lua_tostring(lua_, -1) : "no number");
        return NAN;
    }

    lua_State *lua_ = nullptr;
    Parser parser_;
};

double Sample(int image, int channel, int edge, double x, double y) {
    return 1000 * image + 10 * channel + edge + x / 2 + y / 4;
}

// Rows in turn: precedence and grouping; comparison and logic, which give 1 or 0 (! binds tighter than +, && tighter
// than ||); functions and constants; pixel values, inputs and samplers; the examples of docs/EXPRESSIONS.md.
TEST_F(ParserTest, ExpressionsEvaluateToHandWorkedValues) {
    const double pi = std::numbers::pi, sinh1 = (std::exp(1) - std::exp(-1)) / 2;
    const double t = std::clamp((std::sqrt(0.125) - 0.3) / 0.5, 0.0, 1.0), vignette = 1 - t * t * (3 - 2 * t);
    // clang-format off
    const struct {
        const char *text;
        double value;
        Ctx context = Ctx::Pixel;
    } cases[] = {
        {"1+2*3", 7}, {"(1+2)*3", 9}, {"10-4-3", 3}, {"10-(4-3)", 9}, {"100/10/5", 2}, {"2/4*8", 4}, {"2*3%4", 2},
        {"2^3^2", 512}, {"(2^3)^2", 64}, {"-2^2", -4}, {"2^-1", 0.5}, {"-2^-2", -0.25}, {"--1", 1}, {"+-+1", -1},
        {"r1--1", 2}, {"7 % 3", 1}, {"-7 % 3", 2}, {"7 % -3", -2}, {".5e1 + 5.", 10},
        {"3 >= 3", 1}, {"3 <= 2", 0}, {"3 != 3", 0}, {"2 == 2", 1}, {"2 > 1 + 1", 0}, {"1 < 2 == 1", 1},
        {"1 || 0 && 0", 1}, {"(1 || 0) && 0", 0}, {"!0 + 1", 2}, {"!(0 + 1)", 0}, {"not 1 or 1 and 0", 0},
        {"!!5", 1}, {"0.5 && -1", 1}, {"if(r1 > 1, 5, 6)", 6}, {"if(0.5, 1, 2)", 1}, {"if(1, 0, 5)", 0},
        {"if(0, 1, if(1, 2, 3))", 2}, {"if(1 < 2 && 3 < 2, 1, 2)", 2},
        {"sin(pi/6)", std::sin(pi / 6)}, {"cos(pi)", -1}, {"tan(pi/4)", std::tan(pi / 4)}, {"asin(1)", pi / 2},
        {"acos(1)", 0}, {"atan(1)", pi / 4}, {"atan2(1, -1)", 3 * pi / 4}, {"sinh(1)", sinh1},
        {"cosh(1)^2 - sinh(1)^2", 1}, {"tanh(0.5)", std::tanh(0.5)}, {"sqrt(16)", 4}, {"exp(1) - e", 0},
        {"log(e^2)", 2}, {"log10(1000)", 3}, {"pow(2, 10)", 1024}, {"abs(-3)", 3}, {"min(3, 1, 2)", 1},
        {"max(3, 1, 2, 7)", 7}, {"floor(-1.5)", -2}, {"ceil(-1.5)", -1}, {"round(2.5)", 3}, {"round(-2.5)", -2},
        {"clamp(5, 0, 1)", 1}, {"clamp(-1, 0, 1)", 0}, {"fmod(-7, 3)", -1}, {"sign(-3)", -1}, {"sign(0)", 0},
        {"lerp(2, 4, 0.25)", 2.5}, {"smoothstep(0, 2, 0.5)", 0.15625}, {"smoothstep(0, 1, 3)", 1},
        {"r1", 1}, {"g2", 2.01}, {"a3", 3.03}, {"bgr2", 2.04}, {"cv3", 3.09}, {"dy1", 1.23}, {"px2 + p2x", 22.19},
        {"x * y", 0.1875}, {"w1 / h1 + ay2", 640.0 / 480 + 2}, {"w - h", 840}, {"c2", 0.2}, {"n3", 3.5},
        {"p4z", 42}, {"lut2(3)", 18}, {"s3 + i4", 13}, {"time", 12},
        {"getr1b(0.5, 1)", Sample(1, 0, 0, 0.5, 1)}, {"getcv3m(0, 0)", Sample(3, 9, 3, 0, 0)},
        {"getdy2w(1, 2)", Sample(2, 23, 1, 1, 2)}, {"getbga1d(x, y)", Sample(1, 7, 2, 0.25, 0.75)},
        {"s1 + getg2b(w2, 0) + lut1(h)", -1 + Sample(2, 1, 0, 1280, 0) + 1080.0 * 1080, Ctx::Setup},
        {"n9 + p9y + n2_at(3) + p3x_at(1) + p3y_at(1)", 9.5 + 91 + 203, Ctx::Number},
        {"r1*1.2+0.01", 1.21}, {"r1 * (1 - a2) + r2", 1 * (1 - 2.03) + 2},
        {"(getr1b(x - 0.01, y) + getr1b(x + 0.01, y)) / 2",
         (Sample(1, 0, 0, 0.24, 0.75) + Sample(1, 0, 0, 0.26, 0.75)) / 2},
        {"r1 * (1 - smoothstep(0.3, 0.8, sqrt((x - 0.5)^2 + (y - 0.5)^2)))", vignette},
        {"if(max(r1, g1, b1) > n1, c1, 0) + if(max(r1, g1, b1) > n1 - 1, c1, 0)", 0.1},
    };
    // clang-format on
    for (const auto &c : cases) EXPECT_NEAR(Evaluate(c.text, c.context), c.value, 1e-9) << c.text;
    const double draw = Evaluate("rand()"), ranged = Evaluate("rand(5, 6)");
    EXPECT_TRUE(draw >= 0 && draw < 1 && ranged >= 5 && ranged < 6) << draw << " " << ranged;
}

// The deepest nesting the parser allows still fits LuaJIT's own limits (comparisons used as numbers nest twice in
// Lua for each level of the tree), and a long run of sums does not nest at all.
TEST_F(ParserTest, DeepestAcceptedExpressionsRunInLua) {
    std::string compares = "1", ifs = "1", calls = "1", minus = "1", parens = "1", sum = "0";
    for (int k = 0; k < 39; ++k) {
        compares += " > 0";
        if (k < 13) ifs = "if(" + ifs + " > 0 && !0, 1, 0)";
        calls = "max(" + calls + ", 0)";
        minus = "-" + minus;
        parens = "(" + parens + ")";
    }
    for (int k = 0; k < 1200; ++k) sum += "+getr1b(x, y)-r1"; // near the longest text allowed
    for (const std::string &text : {compares, ifs, calls, parens}) EXPECT_EQ(Evaluate(text), 1) << text;
    EXPECT_EQ(Evaluate(minus), -1);
    EXPECT_NEAR(Evaluate(sum), 1200 * (Sample(1, 0, 0, 0.25, 0.75) - 1), 1e-6);
}

TEST(Parser, FlagsNameWhatWasUsed) {
    using enum ExpressionChannel;
    // clang-format off
    const struct {
        const char *text;
        uint64_t flags;
        Ctx context = Ctx::Pixel;
    } cases[] = {
        {"r1", Image1 | Channel(R)},
        {"getcv2w(x, 0)", Image2 | Sampler2 | Channel(Coverage) | Position},
        {"c3 + w + dx1", Image3 | Current | OutputSize | Image1 | Channel(DisparityX)},
        {"n1 + p2y + lut3(time)", Numbers | Points | Luts | Time},
        {"s2 + i7 + rand()", SetupValue(2) | IntermediateValue(7) | Random},
        {"w3 + s8", Image3 | SetupValue(8), Ctx::Setup},
        {"n1_at(2) + p1y_at(2) + n1", TimedInputs | Numbers, Ctx::Number},
        {"sin(1) + pi + e + if(1, 2, 3)", 0},
    };
    // clang-format on
    for (const auto &c : cases) {
        Parser parser;
        std::string lua;
        ASSERT_TRUE(parser.Parse(c.text, c.context, &lua, nullptr)) << c.text;
        EXPECT_EQ(parser.GetFlags(), c.flags) << c.text;
    }
    // Flags gather over calls; a failed call adds nothing.
    Parser parser;
    std::string lua;
    ASSERT_TRUE(parser.Parse("r1", Ctx::Pixel, &lua, nullptr) && parser.Parse("b2", Ctx::Pixel, &lua, nullptr));
    EXPECT_FALSE(parser.Parse("g3 + nope", Ctx::Pixel, &lua, nullptr));
    EXPECT_EQ(parser.GetFlags(), Image1 | Image2 | Channel(R) | Channel(B));
    parser.ClearFlags();
    EXPECT_EQ(parser.GetFlags(), 0u);
}

// Each failure names its column and cause. The escapes that Lua itself would allow fail too: no name outside the
// language, no strings, fields, methods, indexing, statements, comments or other characters.
TEST(Parser, ErrorsGiveColumnAndCause) {
    // clang-format off
    const struct {
        std::string text;
        int position;
        const char *message;
        Ctx context = Ctx::Pixel;
    } cases[] = {
        {"", 1, "expected a value before 'end of expression'"}, {"r1 +", 5, "expected a value"},
        {"r1 + foo", 6, "unknown name 'foo'"}, {"rr1", 1, "(did you mean 'r1'?)"}, {"(r1", 4, "expected ')'"},
        {"r1)", 3, "unexpected ')'"}, {"r1 g1", 4, "unexpected 'g1'"}, {"max(1,)", 7, "expected a value"},
        {"sin(1, 2)", 1, "sin() cannot take 2 arguments"}, {"min(1)", 1, "min() cannot take 1 argument"},
        {"rand(1)", 1, "cannot take 1"}, {"sin + 1", 1, "is a function"}, {"r1(2)", 1, "'r1' is not a function"},
        {"if(1, 2)", 1, "if() takes 3 arguments"}, {"n9", 1, "'n9' is not available in pixel expressions"},
        {"x", 1, "'x' is not available in number expressions", Ctx::Number},
        {"lut1(0)", 1, "not available", Ctx::Number},
        {"r1 + i1", 1, "'r1' is not available in setup expressions", Ctx::Setup},
        {"1.2.3", 1, "malformed number"}, {"2x", 1, "malformed number"}, {"1e+", 1, "malformed number"},
        {"0x10", 1, "malformed number"}, {"1 + 1e999", 5, "out of range"}, {"r1 = 1", 4, "use '=='"},
        {"r1 & g1", 4, "use '&&'"}, {"r1 | g1", 4, "use '||'"}, {"r1 $ 2", 4, "unexpected character '$'"},
        {"r1 + \xc3\xa9", 6, "byte 0xc3"}, {std::string("r1\0", 3), 3, "byte 0x00"},
        {std::string(41, '(') + "1" + std::string(41, ')'), 41, "nested too deeply"},
        {std::string(45, '-') + "1", 41, "nested too deeply"}, {std::string(20001, '1'), 1, "longer than 20000"},
        {"os.execute(\"x\")", 1, "unknown name 'os'"}, {"io.open", 1, "unknown name 'io'"},
        {"require(1)", 1, "unknown name 'require'"}, {"load(1)", 1, "unknown name 'load'"},
        {"ffi.C", 1, "unknown name 'ffi'"}, {"_G", 1, "unknown name '_G'"}, {"_lut(1, 2)", 1, "unknown name '_lut'"},
        {"math", 1, "unknown name 'math'"}, {"setmetatable(1, 2)", 1, "unknown name"},
        {"getfenv(1)", 1, "unknown name"}, {"string.rep(1, 2)", 1, "unknown name 'string'"},
        {"r1 + \"x\"", 6, "unexpected character '\"'"}, {"r1 + 'x'", 6, "unexpected character '''"},
        {"r1 .. g1", 4, "unexpected character '.'"}, {"r1.R", 3, "unexpected character '.'"},
        {"r1:b()", 3, "unexpected character ':'"}, {"[[x]]", 1, "unexpected character '['"},
        {"r1[1]", 3, "unexpected character '['"}, {"{}", 1, "unexpected character '{'"}, {"#r1", 1, "'#'"},
        {"goto x", 1, "unknown name 'goto'"}, {"r1; os.exit()", 3, "unexpected character ';'"},
        {"r1 -- os.exit()", 7, "unknown name 'os'"}, {"r1 ~= 1", 4, "unexpected character '~'"},
        {"r1 \\ 2", 4, "unexpected character '\\'"}, {"r1 +\xe2\x80\x8b g1", 5, "byte 0xe2"},
        {"sin\n(function() end)", 6, "unknown name 'function'"}, {"p1", 1, "unknown name 'p1'"},
        {"xpos", 1, "unknown name 'xpos'"}, {"img1", 1, "unknown name 'img1'"}, {"end", 1, "unknown name 'end'"},
    };
    // clang-format on
    for (const auto &c : cases) {
        Parser parser;
        std::string lua = "unchanged";
        ParseError error;
        EXPECT_FALSE(parser.Parse(c.text, c.context, &lua, &error)) << c.text.substr(0, 60) << " -> " << lua;
        EXPECT_EQ(error.position, c.position) << c.text.substr(0, 60) << ": " << error.Describe();
        EXPECT_NE(error.message.find(c.message), std::string::npos) << c.text.substr(0, 60) << ": " << error.Describe();
        EXPECT_EQ(lua, "unchanged");
        EXPECT_EQ(parser.GetFlags(), 0u);
    }
}

} // namespace
} // namespace Orvane::parser_test
