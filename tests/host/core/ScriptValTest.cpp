#include "host/core/ScriptVal.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <functional>
#include <limits>
#include <numbers>
#include <random>
#include <string>
#include <vector>

namespace Orvane::scriptval_test {
namespace {

constexpr double kInf = std::numeric_limits<double>::infinity();
constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();

uint64_t Bits(double d) {
    uint64_t b;
    std::memcpy(&b, &d, sizeof b);
    return b;
}

double FromBits(uint64_t b) {
    double d;
    std::memcpy(&d, &b, sizeof d);
    return d;
}

ScriptVal Parse(std::string_view text) { return ScriptVal::FromText(text); }

ScriptVal Num(double d) { return ScriptVal(d); }

// A table from a list of key/value pairs, built through Set.
ScriptVal Make(std::initializer_list<ScriptVal::Entry> entries, std::string className = {}) {
    ScriptVal t = ScriptVal::Table(std::move(className));
    for (const auto &[k, v] : entries) t.Set(k, v);
    return t;
}

std::vector<std::string> KeysAsText(const ScriptVal &t) {
    std::vector<std::string> keys;
    for (const auto &e : t.Entries()) keys.push_back(e.first.IsText() ? e.first.AsText() : e.first.ToText());
    return keys;
}

struct ErrorCase {
    const char *what;
    std::string text;
    int line, column;
    std::string message;
};

void ExpectErrors(const std::vector<ErrorCase> &cases) {
    for (const ErrorCase &c : cases) {
        SCOPED_TRACE(c.what);
        try {
            const ScriptVal v = ScriptVal::FromText(c.text);
            ADD_FAILURE() << "parsed without error as: " << v.ToText();
        } catch (const ScriptParseError &e) {
            EXPECT_EQ(e.Line(), c.line);
            EXPECT_EQ(e.Column(), c.column);
            EXPECT_EQ(e.Message(), c.message);
        }
    }
}

// ---------------------------------------------------------------------------------------------------------------
// Values and equality

TEST(ScriptValValue, ConstructorsGiveTheirTypes) {
    EXPECT_TRUE(ScriptVal().IsNil());
    EXPECT_TRUE(ScriptVal(static_cast<const char *>(nullptr)).IsNil());
    EXPECT_TRUE(ScriptVal(true).IsBool());
    EXPECT_TRUE(ScriptVal(true).AsBool());
    EXPECT_FALSE(ScriptVal(false).AsBool());
    EXPECT_EQ(ScriptVal(7).AsNumber(), 7.0);
    EXPECT_EQ(ScriptVal(-3LL).AsNumber(), -3.0);
    EXPECT_EQ(ScriptVal(2.5).GetType(), ScriptVal::Type::Number);
    EXPECT_EQ(ScriptVal("abc").AsText(), "abc");
    EXPECT_EQ(ScriptVal(std::string("a\0b", 3)).AsText().size(), 3u);
    EXPECT_EQ(ScriptVal("").GetType(), ScriptVal::Type::Text);

    const ScriptVal typed = ScriptVal::Table("Orvane.Document");
    EXPECT_TRUE(typed.IsTable());
    EXPECT_EQ(typed.ClassName(), "Orvane.Document");
    EXPECT_EQ(typed.Size(), 0u);
    EXPECT_EQ(ScriptVal::Table().ClassName(), "");

    const ScriptVal ref = ScriptVal::Ref("Background1.Output");
    EXPECT_TRUE(ref.IsRef());
    EXPECT_EQ(ref.AsText(), "Background1.Output");
}

TEST(ScriptValValue, InvalidNamesAreRefused) {
    for (const char *bad : {"", "1abc", "a..b", "a.", ".a", "a b", "end", "a.nil", "Tool-1", "ü"}) {
        SCOPED_TRACE(bad);
        EXPECT_THROW(ScriptVal::Ref(bad), std::invalid_argument);
        if (*bad) {
            EXPECT_THROW(ScriptVal::Table(bad), std::invalid_argument);
        }
    }
    ScriptVal t = ScriptVal::Table();
    t.SetClassName("not a name");
    EXPECT_THROW(t.ToText(), std::invalid_argument);
}

TEST(ScriptValValue, Equality) {
    const struct {
        const char *what;
        ScriptVal a, b;
        bool equal;
    } cases[] = {
        {"nil", ScriptVal(), ScriptVal(), true},
        {"int and double", ScriptVal(1), ScriptVal(1.0), true},
        {"nan equals nan", Num(kNaN), Num(-kNaN), true},
        {"zero signs", Num(0.0), Num(-0.0), true},
        {"different numbers", Num(1.0), Num(std::nextafter(1.0, 2.0)), false},
        {"number and text", ScriptVal(1), ScriptVal("1"), false},
        {"bool and number", ScriptVal(true), ScriptVal(1), false},
        {"text and reference", ScriptVal("a.b"), ScriptVal::Ref("a.b"), false},
        {"texts", ScriptVal("a"), ScriptVal(std::string("a")), true},
        {"nil and false", ScriptVal(), ScriptVal(false), false},
        {"empty tables", ScriptVal::Table(), ScriptVal::Table(), true},
        {"class names differ", ScriptVal::Table("A"), ScriptVal::Table("B"), false},
        {"typed and plain", ScriptVal::Table("A"), ScriptVal::Table(), false},
        {"same entries", Make({{"x", 1}, {"y", 2}}), Make({{"x", 1}, {"y", 2}}), true},
        {"order matters", Make({{"x", 1}, {"y", 2}}), Make({{"y", 2}, {"x", 1}}), false},
        {"values differ", Make({{"x", 1}}), Make({{"x", 2}}), false},
        {"nested differ", Make({{"t", Make({{1, "a"}})}}), Make({{"t", Make({{1, "b"}})}}), false},
        {"nested equal", Make({{"t", Make({{1, "a"}}, "K")}}), Make({{"t", Make({{1, "a"}}, "K")}}), true},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_EQ(c.a == c.b, c.equal);
        EXPECT_EQ(c.b == c.a, c.equal);
        EXPECT_EQ(c.a != c.b, !c.equal);
    }
}

// ---------------------------------------------------------------------------------------------------------------
// Table operations

TEST(ScriptValTable, SetReplacesInPlaceAndNilRemoves) {
    ScriptVal t = ScriptVal::Table();
    t.Set("a", 1).Set("b", 2).Set("c", 3);
    t.Set("b", "two");
    EXPECT_EQ(KeysAsText(t), (std::vector<std::string>{"a", "b", "c"}));
    EXPECT_EQ(*t.Find("b"), ScriptVal("two"));

    t.Set("a", ScriptVal());
    EXPECT_EQ(t.Find("a"), nullptr);
    EXPECT_EQ(KeysAsText(t), (std::vector<std::string>{"b", "c"}));

    t.Set("a", 10); // a removed key comes back at the end
    EXPECT_EQ(KeysAsText(t), (std::vector<std::string>{"b", "c", "a"}));

    t.Set("missing", ScriptVal()); // removing what is not there changes nothing
    EXPECT_EQ(t.Size(), 3u);
    EXPECT_TRUE(t.Remove(ScriptVal("c")));
    EXPECT_FALSE(t.Remove(ScriptVal("c")));
    EXPECT_EQ(KeysAsText(t), (std::vector<std::string>{"b", "a"}));
}

TEST(ScriptValTable, KeysOfDifferentTypesAreDistinct) {
    ScriptVal t = ScriptVal::Table();
    t.Set(ScriptVal("1"), "text one");
    t.Set(ScriptVal(1), "number one");
    t.Set(ScriptVal(true), "true");
    t.Set(ScriptVal(1.5), "one and a half");
    EXPECT_EQ(t.Size(), 4u);
    EXPECT_EQ(*t.Find("1"), ScriptVal("text one"));
    EXPECT_EQ(*t.Find(ScriptVal("1")), ScriptVal("text one"));
    EXPECT_EQ(*t.Find(ScriptVal(1.0)), ScriptVal("number one"));
    EXPECT_EQ(*t.At(1), ScriptVal("number one"));
    EXPECT_EQ(*t.Find(ScriptVal(true)), ScriptVal("true"));
    EXPECT_EQ(t.Find(ScriptVal(false)), nullptr);
    EXPECT_EQ(*t.Find(ScriptVal(1.5)), ScriptVal("one and a half"));
    EXPECT_EQ(t.At(2), nullptr);
    EXPECT_EQ(t.At(0), nullptr);

    // 0 and -0 are one key.
    t.Set(ScriptVal(0.0), "zero");
    t.Set(ScriptVal(-0.0), "minus zero");
    EXPECT_EQ(*t.Find(ScriptVal(0.0)), ScriptVal("minus zero"));
    EXPECT_EQ(t.Size(), 5u);
}

TEST(ScriptValTable, MisuseIsReported) {
    ScriptVal t = ScriptVal::Table();
    for (const ScriptVal &key : {ScriptVal(), Num(kNaN), ScriptVal::Table(), ScriptVal::Ref("a")}) {
        SCOPED_TRACE(key.IsTable() ? "table" : key.IsRef() ? "ref" : key.IsNil() ? "nil" : "nan");
        EXPECT_THROW(t.Set(key, 1), std::invalid_argument);
    }
    EXPECT_EQ(t.Size(), 0u);

    for (ScriptVal scalar : {ScriptVal(1), ScriptVal("x"), ScriptVal(true), ScriptVal::Ref("a")}) {
        EXPECT_THROW(scalar.Set("k", 1), std::logic_error);
        EXPECT_THROW(scalar.Append(1), std::logic_error);
        EXPECT_FALSE(scalar.Remove(ScriptVal("k")));
        EXPECT_EQ(scalar.Find("k"), nullptr);
        EXPECT_EQ(scalar.At(1), nullptr);
        EXPECT_EQ(scalar.Size(), 0u);
        EXPECT_EQ(scalar.ArrayLength(), 0u);
    }

    // Setting into nil makes a plain table.
    ScriptVal n;
    n.Set("k", 1);
    EXPECT_EQ(n, Make({{"k", 1}}));
    ScriptVal m;
    m.Append("x");
    EXPECT_EQ(m, Make({{1, "x"}}));
}

TEST(ScriptValTable, SetWithAKeyFromTheSameTable) {
    ScriptVal t = ScriptVal::Table();
    for (int i = 1; i <= 4; ++i) t.Set(ScriptVal("k" + std::to_string(i)), i);
    // The key refers into the table's own storage while the table grows.
    const ScriptVal &ownKey = t.Entries()[0].first;
    t.Set(ownKey, 100);
    EXPECT_EQ(*t.Find("k1"), ScriptVal(100));
    ScriptVal copy = t;
    t.Set(t.Entries()[1].first, ScriptVal());
    EXPECT_EQ(KeysAsText(t), (std::vector<std::string>{"k1", "k3", "k4"}));
    EXPECT_EQ(copy.Size(), 4u);
}

TEST(ScriptValTable, AppendAndArrayLength) {
    ScriptVal t = ScriptVal::Table();
    t.Append("a").Append("b").Append("c");
    EXPECT_EQ(t.ArrayLength(), 3u);
    EXPECT_EQ(*t.At(3), ScriptVal("c"));

    // A hole stops the array part; Append fills it.
    ScriptVal holes = Make({{1, "a"}, {2, "b"}, {4, "d"}});
    EXPECT_EQ(holes.ArrayLength(), 2u);
    holes.Append("c");
    EXPECT_EQ(*holes.At(3), ScriptVal("c"));
    EXPECT_EQ(holes.ArrayLength(), 4u);
    holes.Append("e");
    EXPECT_EQ(*holes.At(5), ScriptVal("e"));

    // Integer keys count wherever they sit among the entries.
    ScriptVal mixed = Make({{"x", 1}, {2, "b"}, {1, "a"}});
    EXPECT_EQ(mixed.ArrayLength(), 2u);
    mixed.Append("c");
    EXPECT_EQ(KeysAsText(mixed), (std::vector<std::string>{"x", "2", "1", "3"}));

    // Non-integer and non-positive number keys are not part of the array.
    EXPECT_EQ(Make({{0, "z"}, {1.5, "h"}, {-1, "m"}}).ArrayLength(), 0u);

    ScriptVal removed = Make({{1, "a"}, {2, "b"}, {3, "c"}, {4, "d"}});
    removed.Remove(ScriptVal(2));
    EXPECT_EQ(removed.ArrayLength(), 1u);
    EXPECT_EQ(*removed.At(3), ScriptVal("c"));
    removed.Append("B");
    EXPECT_EQ(*removed.At(2), ScriptVal("B"));
    EXPECT_EQ(removed.ArrayLength(), 4u);

    ScriptVal nilAppend = ScriptVal::Table();
    nilAppend.Append(ScriptVal());
    EXPECT_EQ(nilAppend.Size(), 0u);
}

// Random edits checked against a plain list of entries kept by the test.
TEST(ScriptValTable, RandomEditsMatchAPlainModel) {
    std::mt19937 rng(12345);
    using Model = std::vector<ScriptVal::Entry>;
    auto modelFind = [](Model &m, const ScriptVal &key) {
        for (size_t i = 0; i < m.size(); ++i)
            if (m[i].first == key) return static_cast<long>(i);
        return -1L;
    };
    auto modelSet = [&](Model &m, const ScriptVal &key, const ScriptVal &value) {
        const long i = modelFind(m, key);
        if (value.IsNil()) {
            if (i >= 0) m.erase(m.begin() + i);
        } else if (i >= 0) {
            m[static_cast<size_t>(i)].second = value;
        } else {
            m.emplace_back(key, value);
        }
    };
    auto modelArrayLength = [&](Model &m) {
        size_t n = 0;
        while (modelFind(m, ScriptVal(static_cast<double>(n + 1))) >= 0) ++n;
        return n;
    };

    for (int round = 0; round < 40; ++round) {
        ScriptVal t = ScriptVal::Table();
        Model model;
        ScriptVal snapshot = t;
        Model snapshotModel;
        for (int step = 0; step < 150; ++step) {
            const int op = static_cast<int>(rng() % 10);
            const ScriptVal value = rng() % 6 == 0 ? ScriptVal() : ScriptVal(static_cast<double>(rng() % 1000));
            ScriptVal key = rng() % 3 == 0 ? ScriptVal("k" + std::to_string(rng() % 8))
                                           : ScriptVal(static_cast<double>(rng() % 12));
            if (op < 4) {
                t.Set(key, value);
                modelSet(model, key, value);
            } else if (op < 7) {
                t.Append(value);
                if (!value.IsNil())
                    model.emplace_back(ScriptVal(static_cast<double>(modelArrayLength(model) + 1)), value);
            } else if (op < 9) {
                const bool had = modelFind(model, key) >= 0;
                EXPECT_EQ(t.Remove(key), had);
                modelSet(model, key, ScriptVal());
            } else {
                snapshot = t;
                snapshotModel = model;
            }
            ASSERT_EQ(t.Entries(), model) << "round " << round << " step " << step;
            ASSERT_EQ(t.ArrayLength(), modelArrayLength(model)) << "round " << round << " step " << step;
            for (size_t i = 0; i <= 13; ++i) {
                const long at = modelFind(model, ScriptVal(static_cast<double>(i)));
                const ScriptVal *found = t.At(i);
                if (at < 0 || i == 0)
                    ASSERT_EQ(found, nullptr);
                else
                    ASSERT_TRUE(found && *found == model[static_cast<size_t>(at)].second);
            }
            ASSERT_EQ(snapshot.Entries(), snapshotModel) << "a copy changed with the original";
        }
    }
}

TEST(ScriptValTable, CopiesAreUnaffectedByMutation) {
    const ScriptVal original = Make({{1, "a"}, {2, "b"}, {"name", "n"}, {"inner", Make({{"x", 1}})}}, "K");
    const std::vector<std::pair<const char *, std::function<void(ScriptVal &)>>> edits = {
        {"replace", [](ScriptVal &v) { v.Set("name", "changed"); }},
        {"add", [](ScriptVal &v) { v.Set("extra", true); }},
        {"remove", [](ScriptVal &v) { v.Remove(ScriptVal("name")); }},
        {"remove by nil", [](ScriptVal &v) { v.Set(ScriptVal(1), ScriptVal()); }},
        {"append", [](ScriptVal &v) { v.Append("c"); }},
        {"class name", [](ScriptVal &v) { v.SetClassName("Other"); }},
        {"inner",
         [](ScriptVal &v) {
             ScriptVal inner = *v.Find("inner");
             inner.Set("x", 2);
             v.Set("inner", inner);
         }},
    };
    for (const auto &[what, edit] : edits) {
        SCOPED_TRACE(what);
        ScriptVal a = original;
        ScriptVal b = a;
        EXPECT_EQ(&a.Entries(), &b.Entries()); // a copy shares storage until one side changes
        edit(a);
        EXPECT_NE(a, original);
        EXPECT_EQ(b, original);
        EXPECT_EQ(b.ToText(), original.ToText());
        edit(b);
        EXPECT_EQ(a, b);
    }
    // The inner table held by the untouched original still has its old value.
    EXPECT_EQ(*original.Find("inner")->Find("x"), ScriptVal(1));
}

// ---------------------------------------------------------------------------------------------------------------
// Numbers

TEST(ScriptValNumbers, WrittenForms) {
    const struct {
        double value;
        const char *text;
    } cases[] = {
        {0.0, "0"},           {-0.0, "-0"},       {1.0, "1"},
        {-42.0, "-42"},       {1.5, "1.5"},       {0.1, "0.1"},
        {100000.0, "100000"}, {1920.0, "1920"},   {9007199254740994.0, "9007199254740994"},
        {1e300, "1e+300"},    {5e-324, "5e-324"}, {1.0 / 3.0, "0.3333333333333333"},
        {kInf, "1/0"},        {-kInf, "-1/0"},    {kNaN, "0/0"},
        {-kNaN, "0/0"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.text);
        EXPECT_EQ(Num(c.value).ToText(), c.text);
    }
}

TEST(ScriptValNumbers, RoundTripIsBitExact) {
    std::vector<double> values = {0.0,
                                  -0.0,
                                  0.1,
                                  0.2 + 0.1,
                                  1e300,
                                  -1e300,
                                  1e-300,
                                  5e-324,
                                  -5e-324,
                                  std::numeric_limits<double>::min(),
                                  std::numeric_limits<double>::max(),
                                  std::numeric_limits<double>::lowest(),
                                  9007199254740992.0,
                                  9007199254740993.0 + 1.0,
                                  9007199254740991.0,
                                  std::ldexp(1.0, 63),
                                  std::ldexp(1.0, 64) + 4096.0,
                                  1e21,
                                  1e22,
                                  123456.789,
                                  std::numbers::pi,
                                  kInf,
                                  -kInf};
    std::mt19937_64 rng(99);
    for (int i = 0; i < 20000; ++i) {
        const double d = FromBits(rng());
        if (!std::isnan(d)) values.push_back(d);
    }
    for (double d : values) {
        const std::string text = Num(d).ToText();
        const ScriptVal back = Parse(text);
        ASSERT_TRUE(back.IsNumber()) << text;
        ASSERT_EQ(Bits(back.AsNumber()), Bits(d)) << text;
    }
    EXPECT_TRUE(std::isnan(Parse(Num(kNaN).ToText()).AsNumber()));
}

TEST(ScriptValNumbers, KnownAnswerParses) {
    const struct {
        const char *text;
        double value;
    } cases[] = {
        {"0", 0.0},
        {"42", 42.0},
        {"0x10", 16.0},
        {"0XfF", 255.0},
        {"0x1p4", 16.0},
        {"0x.8", 0.5},
        {"0xA.8P1", 21.0},
        {"0x7fffffffffffffff", 9223372036854775808.0},
        {"1e2", 100.0},
        {"1E-2", 0.01},
        {"2.5e+3", 2500.0},
        {".5", 0.5},
        {"5.", 5.0},
        {"-3", -3.0},
        {"- 3", -3.0},
        {"-0x10", -16.0},
        {"1/0", kInf},
        {"-1/0", -kInf},
        {"- 1 / 0", -kInf},
        {"1.0/0.0", kInf},
        {"3e-324", 5e-324}, // rounds to the smallest denormal
        {"1e-400", 0.0},    // underflow reads as zero
        {"0.000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000"
         "0000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000"
         "00000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000"
         "000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000000001",
         0.0},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.text);
        const ScriptVal v = Parse(c.text);
        ASSERT_TRUE(v.IsNumber());
        EXPECT_EQ(Bits(v.AsNumber()), Bits(c.value));
    }
    EXPECT_TRUE(std::isnan(Parse("0/0").AsNumber()));
    EXPECT_TRUE(std::signbit(Parse("-0").AsNumber()));
    EXPECT_TRUE(std::signbit(Parse("-1e-400").AsNumber()));
}

// ---------------------------------------------------------------------------------------------------------------
// Texts

TEST(ScriptValText, WrittenWithEscapes) {
    const struct {
        std::string text, written;
    } cases[] = {
        {"plain", R"("plain")"},
        {"", R"("")"},
        {"say \"hi\"", R"("say \"hi\"")"},
        {"it's", R"("it's")"},
        {"back\\slash", R"("back\\slash")"},
        {"a\nb\rc\td", R"("a\nb\rc\td")"},
        {std::string("\0", 1), R"("\0")"},
        {std::string("\0x", 2), R"("\0x")"},
        {std::string("\0"
                     "1",
                     2),
         R"("\0001")"},
        {"\x01\x1f", R"("\1\31")"},
        {"\x1b[0m", R"("\27[0m")"},
        {"\x1b"
         "9",
         R"("\0279")"},
        {"\x7f", R"("\127")"},
        {"\a\b\f\v", R"("\7\8\12\11")"},
        {"h\xc3\xa9llo \xe2\x9c\x93", "\"h\xc3\xa9llo \xe2\x9c\x93\""},
        {"\xff\x80", "\"\xff\x80\""},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.written);
        EXPECT_EQ(ScriptVal(c.text).ToText(), c.written);
        EXPECT_EQ(Parse(c.written).AsText(), c.text);
    }
}

TEST(ScriptValText, EveryByteRoundTrips) {
    std::string all;
    for (int c = 0; c < 256; ++c) {
        all += static_cast<char>(c);
        all += static_cast<char>('0' + c % 10); // a digit after each byte tests escape padding
    }
    const ScriptVal back = Parse(ScriptVal(all).ToText());
    ASSERT_TRUE(back.IsText());
    EXPECT_EQ(back.AsText(), all);
}

TEST(ScriptValText, KnownAnswerParses) {
    const struct {
        const char *what;
        std::string text, value;
    } cases[] = {
        {"single quotes", R"('it\'s "quoted"')", "it's \"quoted\""},
        {"letter escapes", R"("\a\b\f\n\r\t\v\\\"\'")", "\a\b\f\n\r\t\v\\\"'"},
        {"decimal escapes", R"("\65\066\0677\255")", "ABC7\xff"},
        {"decimal zero", R"("a\0b")", std::string("a\0b", 3)},
        {"raw nul", std::string("\"a\0b\"", 5), std::string("a\0b", 3)},
        {"backslash newline", "\"a\\\nb\"", "a\nb"},
        {"backslash crlf", "\"a\\\r\nb\"", "a\nb"},
        {"long string", "[[line1\r\nline2\rline3]]", "line1\nline2\nline3"},
        {"long string first newline dropped", "[[\nx]]", "x"},
        {"only the first newline dropped", "[[\n\nx]]", "\nx"},
        {"leveled long string", "[==[a]]b]=]c]==]", "a]]b]=]c"},
        {"no escapes in long string", R"([[a\nb]])", "a\\nb"},
        {"utf-8", "'\xe2\x82\xac'", "\xe2\x82\xac"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        const ScriptVal v = Parse(c.text);
        ASSERT_TRUE(v.IsText());
        EXPECT_EQ(v.AsText(), c.value);
    }
}

// ---------------------------------------------------------------------------------------------------------------
// Writing

TEST(ScriptValWrite, ScalarsAndSmallTables) {
    ScriptVal mixed = ScriptVal::Table();
    mixed.Append(1).Append(2).Set("x", 3);
    ScriptVal afterKey = Make({{"x", 1}, {1, "a"}});
    ScriptVal hole = Make({{1, 1}, {3, 3}});
    ScriptVal keys = Make({{"not id", 1}, {"end", 2}, {1.5, 3}, {true, 4}, {kInf, 5}, {"_ok9", 7}});
    const struct {
        const char *what;
        ScriptVal value;
        std::string text;
    } cases[] = {
        {"nil", ScriptVal(), "nil"},
        {"true", ScriptVal(true), "true"},
        {"false", ScriptVal(false), "false"},
        {"ref", ScriptVal::Ref("Background1.Output"), "Background1.Output"},
        {"empty", ScriptVal::Table(), "{}"},
        {"typed empty", ScriptVal::Table("Orvane.Document"), "Orvane.Document {}"},
        {"array and key", mixed, "{ 1, 2, x = 3 }"},
        {"array after key", afterKey, "{ x = 1, [1] = \"a\" }"},
        {"hole", hole, "{ 1, [3] = 3 }"},
        {"typed", Make({{"Pos", 1}}, "Point"), "Point { Pos = 1 }"},
        {"key forms", keys, "{ [\"not id\"] = 1, [\"end\"] = 2, [1.5] = 3, [true] = 4, [1/0] = 5, _ok9 = 7 }"},
        {"negative key", Make({{-2, 6}}), "{ [-2] = 6 }"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_EQ(c.value.ToText(), c.text);
        EXPECT_EQ(Parse(c.text), c.value);
    }
}

TEST(ScriptValWrite, OneLineLimit) {
    // `{ "..." }` is the text length plus 6.
    ScriptVal fits = ScriptVal::Table();
    fits.Append(std::string(74, 'x'));
    EXPECT_EQ(fits.ToText(), "{ \"" + std::string(74, 'x') + "\" }");
    ScriptVal tooLong = ScriptVal::Table();
    tooLong.Append(std::string(75, 'x'));
    EXPECT_EQ(tooLong.ToText(), "{\n\t\"" + std::string(75, 'x') + "\",\n}");
    EXPECT_EQ(tooLong.ToText(2), "{\n\t\t\t\"" + std::string(75, 'x') + "\",\n\t\t}");

    // A nested table always breaks the line, even an empty one.
    EXPECT_EQ(Make({{"t", ScriptVal::Table()}}).ToText(), "{\n\tt = {},\n}");
}

TEST(ScriptValWrite, NestedLayout) {
    ScriptVal inputs = Make({{"Width", 1920}, {"Height", 1080}});
    ScriptVal background = Make({{"Inputs", inputs}}, "Background");
    ScriptVal tools = Make({{"Background1", background}});
    ScriptVal doc = Make({{"Tools", tools}, {"Link", ScriptVal::Ref("Background1.Output")}}, "Orvane.Document");
    const std::string expected = "Orvane.Document {\n"
                                 "\tTools = {\n"
                                 "\t\tBackground1 = Background {\n"
                                 "\t\t\tInputs = { Width = 1920, Height = 1080 },\n"
                                 "\t\t},\n"
                                 "\t},\n"
                                 "\tLink = Background1.Output,\n"
                                 "}";
    EXPECT_EQ(doc.ToText(), expected);
    // Starting one level in indents every line after the first by one more tab.
    std::string indented = expected;
    for (size_t i = indented.find('\n'); i != std::string::npos; i = indented.find('\n', i + 1))
        indented.insert(i + 1, "\t");
    EXPECT_EQ(doc.ToText(1), indented);
}

TEST(ScriptValWrite, HandWrittenDocumentIsByteStable) {
    const std::string doc =
        "Orvane.Document {\n"
        "\tTools = {\n"
        "\t\tText1 = TextPlus {\n"
        "\t\t\tInputs = {\n"
        "\t\t\t\tStyledText = Input { Value = \"Title \\\"one\\\"\\n\\tsecond line \xe2\x9c\x93\" },\n"
        "\t\t\t\tCenter = Input {\n"
        "\t\t\t\t\tValue = { 0.5, 0.25 },\n"
        "\t\t\t\t},\n"
        "\t\t\t\tSize = Input { Value = 0.1 },\n"
        "\t\t\t},\n"
        "\t\t\tViewInfo = OperatorInfo {\n"
        "\t\t\t\tPos = { 110, -49.5 },\n"
        "\t\t\t},\n"
        "\t\t},\n"
        "\t\tMerge1 = Merge {\n"
        "\t\t\tInputs = {\n"
        "\t\t\t\tBackground = Background1.Output,\n"
        "\t\t\t\tForeground = Text1.Output,\n"
        "\t\t\t\t[\"Blend Mode\"] = \"Screen\",\n"
        "\t\t\t},\n"
        "\t\t},\n"
        "\t},\n"
        "\tKeyframes = {\n"
        "\t\t{ 0, 1, 0.3333333333333333, [true] = false },\n"
        "\t\t{ 24, 1/0, -1/0, 0/0, 1e+300, 5e-324, -0 },\n"
        "\t},\n"
        "\tRange = { 0, 100000 },\n"
        "\tEmpty = {},\n"
        "\tFlags = Orvane.Flags {},\n"
        "}";
    const ScriptVal v = Parse(doc);
    EXPECT_EQ(v.ToText(), doc);
    const ScriptVal *merge = v.Find("Tools")->Find("Merge1");
    ASSERT_NE(merge, nullptr);
    EXPECT_EQ(merge->ClassName(), "Merge");
    EXPECT_EQ(*merge->Find("Inputs")->Find("Background"), ScriptVal::Ref("Background1.Output"));
    EXPECT_EQ(*merge->Find("Inputs")->Find("Blend Mode"), ScriptVal("Screen"));
    EXPECT_EQ(v.Find("Keyframes")->At(2)->At(2)->AsNumber(), kInf);
}

TEST(ScriptValWrite, LooseTextIsNormalised) {
    const std::string loose = "-- saved by hand\n"
                              "return Orvane.Document{ --[[ a\n long comment ]] Tools={ 'a' ; [==[b]==], x=1.50, } ;\n"
                              "  Link = Tool . Output ; [ [[key]] ] = 0x10 }; -- trailing comment";
    // Comments stay where they stood: before the value, before an entry (one after a '{' counts for the first
    // entry); the one after the whole value has nothing to stand before and goes.
    const std::string canonical = "-- saved by hand\n"
                                  "Orvane.Document {\n"
                                  "\t--[[ a\n long comment ]]\n"
                                  "\tTools = { \"a\", \"b\", x = 1.5 },\n"
                                  "\tLink = Tool.Output,\n"
                                  "\tkey = 16,\n"
                                  "}";
    const ScriptVal v = Parse(loose);
    EXPECT_EQ(v.ToText(), canonical);
    EXPECT_EQ(Parse(canonical), v);
}

// ---------------------------------------------------------------------------------------------------------------
// Round trips

TEST(ScriptValRoundTrip, EveryKindOfValue) {
    ScriptVal deep = ScriptVal::Table("Level.Zero");
    ScriptVal *cursor = &deep;
    std::vector<ScriptVal> chain;
    for (int i = 0; i < 10; ++i) chain.push_back(ScriptVal::Table(i % 2 ? "Odd" : ""));
    for (int i = 9; i > 0; --i) chain[static_cast<size_t>(i - 1)].Set("next", chain[static_cast<size_t>(i)]);
    cursor->Set("chain", chain[0]);

    ScriptVal doc = ScriptVal::Table("Orvane.Document");
    doc.Append("first").Append(2).Append(true).Append(ScriptVal::Ref("A.B.C"));
    doc.Set("text", std::string("tabs\tquotes\"'\\ nul\0 bell\a utf8 \xc3\xa9 high \xff", 34));
    doc.Set(ScriptVal(-1), "negative key");
    doc.Set(ScriptVal(0.5), "fractional key");
    doc.Set(ScriptVal(-kInf), "infinite key");
    doc.Set(ScriptVal(false), "false key");
    doc.Set("with space", ScriptVal::Table());
    doc.Set("numbers", Make({{1, kNaN}, {2, -0.0}, {3, 1e-310}, {4, 0.1}}));
    doc.Set("deep", deep);
    doc.Set("big", ScriptVal::Table());
    ScriptVal big = ScriptVal::Table();
    for (int i = 0; i < 200; ++i) big.Append(i * 0.25);
    doc.Set("big", big); // replaced in place, order kept
    doc.Set(ScriptVal(100), "far index");

    const std::string text = doc.ToText();
    const ScriptVal back = Parse(text);
    EXPECT_EQ(back, doc);
    EXPECT_EQ(back.ToText(), text);
    EXPECT_EQ(KeysAsText(back), KeysAsText(doc));
    EXPECT_EQ(back.ArrayLength(), 4u);
    EXPECT_TRUE(std::signbit(back.Find("numbers")->At(2)->AsNumber()));
}

TEST(ScriptValRoundTrip, NestingLimit) {
    auto nested = [](int levels) {
        return std::string(static_cast<size_t>(levels), '{') + std::string(static_cast<size_t>(levels), '}');
    };
    const ScriptVal v = Parse(nested(256));
    const ScriptVal *p = &v;
    int depth = 1;
    while (p->Size() == 1) p = p->At(1), ++depth;
    EXPECT_EQ(depth, 256);
    EXPECT_EQ(Parse(v.ToText()), v);

    ExpectErrors({
        {"257 levels", nested(257), 1, 257, "nesting too deep"},
        {"typed tables count", "A{" + nested(256) + "}", 1, 258, "nesting too deep"},
        {"a million open braces", std::string(1000000, '{'), 1, 257, "nesting too deep"},
        {"on a later line", "{\n" + nested(256), 2, 256, "nesting too deep"},
    });
}

// ---------------------------------------------------------------------------------------------------------------
// Parsing

TEST(ScriptValParse, Structure) {
    const struct {
        const char *what;
        std::string text;
        ScriptVal expected;
    } cases[] = {
        {"return prefix", "return { 1 }", Make({{1, 1}})},
        {"return with semicolon", "return {};", ScriptVal::Table()},
        {"bare scalar", "  true  ", ScriptVal(true)},
        {"nil", "nil", ScriptVal()},
        {"bom", "\xEF\xBB\xBF{ a = 1 }", Make({{"a", 1}})},
        {"separators", "{ 1; 2, 3; }", Make({{1, 1}, {2, 2}, {3, 3}})},
        {"positional counting", "{ 'a', x = 1, 'b', [10] = 'j', 'c' }",
         Make({{1, "a"}, {"x", 1}, {2, "b"}, {10, "j"}, {3, "c"}})},
        {"positional overrides earlier key", "{ [1] = 'a', 'b' }", Make({{1, "b"}})},
        {"later key overrides positional", "{ 'b', [1] = 'a' }", Make({{1, "a"}})},
        {"duplicate keeps place", "{ a = 1, b = 2, a = 3 }", Make({{"a", 3}, {"b", 2}})},
        {"nil removes, re-add goes last", "{ a = 1, b = 2, a = nil, a = 3 }", Make({{"b", 2}, {"a", 3}})},
        {"positional nil keeps counting", "{ nil, 2 }", Make({{2, 2}})},
        {"bracket keys", "{ ['x'] = 1, [2.5] = 2, [false] = 3, [-1/0] = 4 }",
         Make({{"x", 1}, {2.5, 2}, {false, 3}, {-kInf, 4}})},
        {"reference", "Background1.Output", ScriptVal::Ref("Background1.Output")},
        {"single name reference", "Tool1", ScriptVal::Ref("Tool1")},
        {"reference with spaces", "a . b .c", ScriptVal::Ref("a.b.c")},
        {"reference lookalike", "os.exit", ScriptVal::Ref("os.exit")},
        {"typed table", "Orvane.Document { }", ScriptVal::Table("Orvane.Document")},
        {"typed table over lines", "Merge -- c\n{ x = y.z }", Make({{"x", ScriptVal::Ref("y.z")}}, "Merge")},
        {"keyword-like names", "{ ends = 1, nil_ = 2, If = 3 }", Make({{"ends", 1}, {"nil_", 2}, {"If", 3}})},
        {"comment forms", "--[==[ ]] ]==] -- line\n--[ not long\n{ --[[x]] 1 --[[y]] }", Make({{1, 1}})},
        {"comment at end without newline", "1 -- end", ScriptVal(1)},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_EQ(Parse(c.text), c.expected);
    }
}

// Many keyed fields with repeats and removals: the parsed table matches the same fields applied through Set.
TEST(ScriptValParse, LargeTablesFollowSetSemantics) {
    std::mt19937 rng(7);
    for (int round = 0; round < 10; ++round) {
        std::string text = "{";
        ScriptVal expected = ScriptVal::Table();
        int positional = 0;
        for (int i = 0; i < 400; ++i) {
            const int kind = static_cast<int>(rng() % 4);
            const bool nil = rng() % 8 == 0;
            const int n = static_cast<int>(rng() % 60);
            const std::string value = nil ? "nil" : std::to_string(i);
            const ScriptVal v = nil ? ScriptVal() : ScriptVal(i);
            if (kind == 0) {
                text += "k" + std::to_string(n) + " = " + value + ", ";
                expected.Set("k" + std::to_string(n), v);
            } else if (kind == 1) {
                text += "[" + std::to_string(n) + "] = " + value + ", ";
                expected.Set(ScriptVal(n), v);
            } else if (kind == 2) {
                text += "[\"s" + std::to_string(n) + "\"] = " + value + "; ";
                expected.Set("s" + std::to_string(n), v);
            } else {
                text += value + ", ";
                expected.Set(ScriptVal(++positional), v);
            }
        }
        text += "}";
        const ScriptVal parsed = Parse(text);
        ASSERT_EQ(parsed, expected) << "round " << round;
        ASSERT_EQ(parsed.ArrayLength(), expected.ArrayLength());
        ASSERT_EQ(Parse(parsed.ToText()), parsed);
    }

    std::string array = "{";
    for (int i = 1; i <= 100000; ++i) array += std::to_string(i) + ",";
    array += "}";
    const ScriptVal big = Parse(array);
    EXPECT_EQ(big.Size(), 100000u);
    EXPECT_EQ(big.ArrayLength(), 100000u);
    EXPECT_EQ(*big.At(77777), ScriptVal(77777));
}

TEST(ScriptValParse, ErrorPositions) {
    ExpectErrors({
        {"unterminated string", "{ a = \"abc", 1, 7, "unfinished string"},
        {"newline in string", "{\n  a = 'x\n' }", 2, 7, "unfinished string"},
        {"escape at end", "\"abc\\", 1, 1, "unfinished string"},
        {"missing brace", "{\n  a = 1,\n  b = 2\n", 4, 1, "expected '}' to close table opened at line 1"},
        {"missing comma", "{ a = 1 b = 2 }", 1, 9, "expected '}' to close table opened at line 1"},
        {"missing inner brace", "{\n\tx = {\n\t\t1,\n}", 4, 2, "expected '}' to close table opened at line 1"},
        {"garbage after value", "{ a = 1 } x", 1, 11, "unexpected name 'x' after the value"},
        {"symbol after value", "{}\n}", 2, 1, "unexpected symbol '}'"},
        {"two values", "1 2", 1, 3, "unexpected number after the value"},
        {"function call", "os.exit()", 1, 8, "function calls are not allowed"},
        {"call in a table", "{ x = os.exit(1) }", 1, 14, "function calls are not allowed"},
        {"call with text", "{ require 'io' }", 1, 11, "function calls are not allowed"},
        {"method call", "{ a:b() }", 1, 4, "unexpected symbol ':'"},
        {"assignment", "x = 1 + 2", 1, 3, "unexpected symbol '='"},
        {"arithmetic", "{ x = 1 + 2 }", 1, 9, "unexpected symbol '+'"},
        {"arithmetic at top", "1 + 2", 1, 3, "unexpected symbol '+'"},
        {"division", "{ 1/2 }", 1, 4, "division is only allowed as 1/0, -1/0 or 0/0"},
        {"division by nonzero", "2/0", 1, 2, "division is only allowed as 1/0, -1/0 or 0/0"},
        {"negative divisor", "1/-0", 1, 2, "division is only allowed as 1/0, -1/0 or 0/0"},
        {"minus before name", "-x", 1, 1, "'-' must be followed by a number"},
        {"double minus", "- -1", 1, 1, "'-' must be followed by a number"},
        {"function", "function() end", 1, 1, "unexpected 'function'"},
        {"keyword as key", "{ end = 1 }", 1, 3, "unexpected 'end'"},
        {"empty", "", 1, 1, "unexpected end of text"},
        {"only return", "return", 1, 7, "unexpected end of text"},
        {"only comment", "  -- nothing", 1, 13, "unexpected end of text"},
        {"leading separator", "{ , }", 1, 3, "unexpected symbol ','"},
        {"double separator", "{ 1,, }", 1, 5, "unexpected symbol ','"},
        {"dot without name", "a.", 1, 3, "expected a name after '.'"},
        {"keyword after dot", "a.end", 1, 3, "expected a name after '.'"},
        {"number too big", "{ 1e400 }", 1, 3, "number out of range"},
        {"hex too big", "0x1p99999", 1, 1, "number out of range"},
        {"malformed number", "3x", 1, 1, "malformed number near '3x'"},
        {"two dots", "1.2.3", 1, 1, "malformed number near '1.2.3'"},
        {"bare exponent", "1e+", 1, 1, "malformed number near '1e+'"},
        {"bare hex", "0x", 1, 1, "malformed number near '0x'"},
        {"invalid escape", "'a\\qb'", 1, 3, "invalid escape sequence '\\q'"},
        {"decimal escape too large", "\"\\256\"", 1, 2, "decimal escape too large"},
        {"unfinished long string", "\n[==[ x ]=]", 2, 1, "unfinished long string"},
        {"unfinished long comment", "1 --[[ x", 1, 3, "unfinished long comment"},
        {"bad long delimiter", "[=x", 1, 1, "invalid long string delimiter"},
        {"nil key", "{ [nil] = 1 }", 1, 4, "table key cannot be nil"},
        {"nan key", "{ [0/0] = 1 }", 1, 4, "table key cannot be NaN"},
        {"table key", "{ [{}] = 1 }", 1, 4, "table key must be a number, text or boolean"},
        {"name key", "{ [x] = 1 }", 1, 4, "table key must be a number, text or boolean"},
        {"unclosed key", "{ [1 = 2 }", 1, 6, "expected ']' after table key"},
        {"key without value", "{ [1] 2 }", 1, 7, "expected '=' after table key"},
        {"nul byte", std::string("{ \0 }", 5), 1, 3, "unexpected byte 0x00"},
        {"high byte", "{ \xff }", 1, 3, "unexpected byte 0xff"},
        {"columns count characters", "{ \"\xc3\xbc\xe2\x9c\x93\" + }", 1, 8, "unexpected symbol '+'"},
        {"crlf lines", "{\r\n a = 1\r\n +", 3, 2, "unexpected symbol '+'"},
        {"cr lines", "{\r\r+", 3, 1, "unexpected symbol '+'"},
        {"line opened later", "{\n\n  t = {\n 1 2", 4, 4, "expected '}' to close table opened at line 3"},
    });
}

TEST(ScriptValParse, ErrorText) {
    try {
        Parse("{\n    a = ?\n}");
        FAIL() << "no error";
    } catch (const ScriptParseError &e) {
        EXPECT_STREQ(e.what(), "line 2, column 9: unexpected symbol '?'");
        EXPECT_EQ(e.Message(), "unexpected symbol '?'");
    }
}

// Mutated documents either parse or fail with a ScriptParseError; whatever parses writes back to an equal value.
TEST(ScriptValParse, MutatedTextNeverCrashes) {
    const std::vector<std::string> seeds = {
        "return Orvane.Document {\n\tTools = {\n\t\tB = Background { Inputs = { W = 1920, C = { 0.1, 1/0 } } },\n"
        "\t\tM = Merge { Inputs = { Bg = B.Output, ['x y'] = [==[long]==] } },\n\t},\n}\n",
        "{ 'a\\n\\65', \"b\\\"\", [[c]], -0x1p4, .5e-3, [true] = false, nil; --[[ c ]] x = { { { } } } }",
        "-- comment\n{ [1] = 1, [2] = { n = -1/0, m = 0/0 }, list = { 1, 2, 3, }, ref = a.b.c }",
    };
    const std::vector<std::string> pieces = {
        "{",   "}",   "[[",  "]]", "--[[", "--", "\"", "'",   "\\",  "0x", "1/0", "=",    ",",
        ";",   ".",   "[",   "]",  "-",    "e9", "\n", "end", "nil", "()", "\\9", "\xff", std::string(1, '\0'),
        "[=[", "]=]", "{{{{"};
    std::mt19937 rng(2024);
    int parsed = 0, rejected = 0;
    for (int iter = 0; iter < 4000; ++iter) {
        std::string text = seeds[rng() % seeds.size()];
        const int mutations = 1 + static_cast<int>(rng() % 4);
        for (int m = 0; m < mutations && !text.empty(); ++m) {
            const size_t at = rng() % text.size();
            switch (rng() % 4) {
            case 0: text[at] = static_cast<char>(rng() % 256); break;
            case 1: text.erase(at, 1 + rng() % 8); break;
            case 2: text.insert(at, pieces[rng() % pieces.size()]); break;
            case 3: text.insert(at, text.substr(rng() % text.size(), rng() % 16)); break;
            }
        }
        try {
            const ScriptVal v = ScriptVal::FromText(text);
            ++parsed;
            ASSERT_EQ(ScriptVal::FromText(v.ToText()), v) << "iteration " << iter;
        } catch (const ScriptParseError &e) {
            ++rejected;
            ASSERT_GE(e.Line(), 1);
            ASSERT_GE(e.Column(), 1);
        }
    }
    // Both outcomes occur, so the loop exercises the parser on both paths.
    EXPECT_GT(parsed, 0);
    EXPECT_GT(rejected, 0);
}

} // namespace
} // namespace Orvane::scriptval_test
