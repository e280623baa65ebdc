#include "host/core/ScriptVal.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <limits>
#include <random>
#include <string>
#include <tuple>
#include <vector>

namespace Orvane::scriptval_test {
namespace {

constexpr double kInf = std::numeric_limits<double>::infinity();
constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();

ScriptVal Parse(std::string_view text) { return ScriptVal::FromText(text); }

// A table from a list of key/value pairs, built through Set.
ScriptVal Make(std::initializer_list<ScriptVal::Entry> entries, std::string className = {}) {
    ScriptVal t = ScriptVal::Table(std::move(className));
    for (const auto &[k, v] : entries) t.Set(k, v);
    return t;
}

// Every comment of a value and of the values inside it, in order, with the path of keys it belongs to.
std::string CommentsOf(const ScriptVal &v, const std::string &path = "") {
    std::string out;
    for (const std::string &c : v.Comments()) out += path + " before: " + c + "\n";
    if (!v.TrailingComment().empty()) out += path + " after: " + v.TrailingComment() + "\n";
    for (const auto &[key, value] : v.Entries()) out += CommentsOf(value, path + "/" + key.ToText());
    return out;
}

// Every value read from `text` stands where its written form starts (keys are placed too: see the notes).
void ExpectPlacesInText(const ScriptVal &v, const std::string &text) {
    ASSERT_GE(v.Line(), 1);
    size_t at = 0;
    for (int line = 1; line < v.Line(); ++line, ++at)
        ASSERT_NE(at = text.find('\n', at), std::string::npos) << "line " << v.Line() << " is past the text";
    for (int column = 1; column < v.Column(); ++column) // columns count characters, not UTF-8 bytes
        for (++at; at < text.size() && (static_cast<unsigned char>(text[at]) & 0xC0) == 0x80;) ++at;
    const std::string written = v.ToText(), form = v.IsTable() ? (v.ClassName().empty() ? "{" : v.ClassName())
                                                               : written.substr(written.rfind('\n') + 1);
    EXPECT_TRUE(std::string_view(text).substr(std::min(at, text.size())).starts_with(form))
        << form << " at " << v.Line() << ":" << v.Column();
    for (const auto &entry : v.Entries()) ExpectPlacesInText(entry.second, text);
}

TEST(ScriptValValue, Equality) {
    const std::tuple<ScriptVal, ScriptVal, bool> cases[] = {
        {ScriptVal(static_cast<const char *>(nullptr)), ScriptVal(), true},
        {ScriptVal(kNaN), ScriptVal(-kNaN), true},
        {ScriptVal(0.0), ScriptVal(-0.0), true},
        {ScriptVal(1.0), ScriptVal(std::nextafter(1.0, 2.0)), false},
        {ScriptVal(1), ScriptVal("1"), false},
        {ScriptVal("a.b"), ScriptVal::Ref("a.b"), false},
        {ScriptVal::Table("A"), ScriptVal::Table(), false},
        {Make({{"x", 1}, {"y", 2}}), Make({{"y", 2}, {"x", 1}}), false},
        {Make({{"t", Make({{1, "a"}})}}), Make({{"t", Make({{1, "b"}})}}), false},
        {Parse("-- c\n{ 1, 2 }"), Make({{1, 1}, {2, 2}}), true}, // places and comments do not count
    };
    for (const auto &[a, b, equal] : cases)
        EXPECT_EQ(std::pair(a == b, b != a), std::pair(equal, !equal)) << a.ToText() << " and " << b.ToText();
}

TEST(ScriptValTable, MisuseIsReportedAndTableOfMakesWhatSetMakesButRefusesRepeatedKeys) {
    for (const char *bad : {"", "1abc", "a..b", "a.", ".a", "a b", "end", "a.nil", "Tool-1", "\xc3\xbc"}) {
        EXPECT_THROW(ScriptVal::Ref(bad), std::invalid_argument) << bad;
        EXPECT_THROW(ScriptVal::Table(*bad ? bad : "-"), std::invalid_argument) << bad;
    }
    ScriptVal t = ScriptVal::Table("A");
    t.SetClassName("not a name");
    EXPECT_THROW(t.ToText(), std::invalid_argument);
    t = ScriptVal::Table();
    for (const ScriptVal &key : {ScriptVal(), ScriptVal(kNaN), ScriptVal::Table(), ScriptVal::Ref("a")})
        EXPECT_THROW(t.Set(key, 1), std::invalid_argument) << key.ToText();
    EXPECT_EQ(t.Size(), 0u);
    for (ScriptVal scalar : {ScriptVal(1), ScriptVal("x"), ScriptVal(true), ScriptVal::Ref("a")}) {
        EXPECT_THROW(scalar.Set("k", 1), std::logic_error);
        EXPECT_THROW(scalar.Append(1), std::logic_error);
        EXPECT_FALSE(scalar.Remove(ScriptVal("k")) || scalar.At(1) || scalar.Find("k"));
    }
    // Setting into nil makes a plain table.
    EXPECT_EQ(ScriptVal().Set("k", 1), Make({{"k", 1}}));
    EXPECT_EQ(ScriptVal().Append("x"), Make({{1, "x"}}));
    const ScriptVal of = ScriptVal::TableOf("Point", {{1, "a"}, {2, "b"}, {"x", 2}, {"1", 3}, {false, 0}});
    EXPECT_EQ(of, Make({{1, "a"}, {2, "b"}, {"x", 2}, {"1", 3}, {false, 0}}, "Point"));
    EXPECT_TRUE(*of.At(2) == ScriptVal("b") && !of.At(3));
    EXPECT_EQ(ScriptVal::TableOf({}, {{"x", 1}, {2, 2}, {1, 1}}).ArrayLength(), 2u);
    for (const auto &[entries, message] : std::vector<std::pair<std::vector<ScriptVal::Entry>, std::string>>{
             {{{"a", 1}, {"b", 2}, {"a", 3}}, "key \"a\" given twice"},
             {{{0.0, 1}, {-0.0, 2}}, "key -0 given twice"},
             {{{kNaN, 1}}, "invalid key or nil value"},
             {{{ScriptVal::Table(), 1}}, "invalid key or nil value"},
             {{{"a", ScriptVal()}}, "invalid key or nil value"}}) {
        try {
            ADD_FAILURE() << "accepted " << ScriptVal::TableOf({}, entries).ToText();
        } catch (const std::invalid_argument &e) {
            EXPECT_EQ(e.what(), "ScriptVal::TableOf: " + message);
        }
    }
    EXPECT_THROW(ScriptVal::TableOf("not a name", {}), std::invalid_argument);
}

// Random edits checked against a plain list of entries kept by the test; copies taken on the way never change.
TEST(ScriptValTable, RandomEditsMatchAPlainModel) {
    using Model = std::vector<ScriptVal::Entry>;
    auto arrayLength = [](const Model &m) {
        size_t n = 0;
        while (std::ranges::any_of(m, [&](const auto &e) { return e.first == ScriptVal(static_cast<double>(n + 1)); }))
            ++n;
        return n;
    };
    // Texts that read like numbers, both zeros, booleans, a fraction and a negative: keys of one kind never meet
    // another, and only whole positive numbers make the array part.
    std::vector<ScriptVal> keys = {"0", "1", "k", true, false, -0.0, 1.5, -1};
    for (int i = 0; i <= 11; ++i) keys.emplace_back(i);
    std::mt19937 rng(12345);
    for (int round = 0; round < 40; ++round) {
        ScriptVal t = ScriptVal::Table(), snapshot = t;
        Model model, snapshotModel;
        for (int step = 0; step < 150; ++step) {
            const int op = static_cast<int>(rng() % 10);
            const ScriptVal value = rng() % 6 == 0 ? ScriptVal() : ScriptVal(static_cast<double>(rng() % 1000));
            const ScriptVal &key = keys[rng() % keys.size()];
            const auto at = std::find_if(model.begin(), model.end(), [&](const auto &e) { return e.first == key; });
            if (op < 4) {
                key.IsText() && op % 2 ? t.Set(key.AsText(), value) : t.Set(key, value);
                (at == model.end() ? model.emplace_back(key, ScriptVal()) : *at).second = value;
                std::erase_if(model, [](const auto &e) { return e.second.IsNil(); });
            } else if (op < 7) {
                t.Append(value);
                if (!value.IsNil()) model.emplace_back(ScriptVal(static_cast<double>(arrayLength(model) + 1)), value);
            } else if (op < 9) {
                EXPECT_EQ(t.Remove(key), at != model.end());
                if (at != model.end()) model.erase(at);
            } else {
                snapshot = t;
                snapshotModel = model;
            }
            ASSERT_EQ(std::pair(t.Entries(), t.ArrayLength()), std::pair(model, arrayLength(model)))
                << "round " << round << " step " << step;
            ASSERT_EQ(snapshot.Entries(), snapshotModel) << "a copy changed with the original";
        }
    }
}

TEST(ScriptValScalars, NumbersAndTextsAreWrittenShortestOrEscapedAndReadInEveryForm) {
    std::string written;
    for (double d : {0.0, -0.0, -42.0, 0.1, 1e5, 1e300, 5e-324, kInf, -kInf, kNaN, -kNaN, 1.0 / 3, 0x1p53 + 2})
        written += ScriptVal(d).ToText() + " ";
    EXPECT_EQ(written, "0 -0 -42 0.1 100000 1e+300 5e-324 1/0 -1/0 0/0 0/0 0.3333333333333333 9007199254740994 ");
    std::vector<double> values;
    for (double d :
         {0.0, 0.1, 0.30000000000000004, 1e300, 1e-300, 5e-324, 1e21, 1e22, 123456.789, 3.141592653589793, kInf,
          0x1p-1022, 0x1.fffffffffffffp1023, 0x1p53 - 1, 0x1p53, 0x1p53 + 2, 0x1p63, 0x1.0000000000001p64})
        values.insert(values.end(), {d, -d});
    std::mt19937_64 rng(99);
    for (int i = 0; i < 20000; ++i)
        if (const double d = std::bit_cast<double>(rng()); !std::isnan(d)) values.push_back(d);
    for (double d : values) {
        const ScriptVal back = Parse(ScriptVal(d).ToText());
        ASSERT_TRUE(back.IsNumber()) << d;
        ASSERT_EQ(std::bit_cast<uint64_t>(back.AsNumber()), std::bit_cast<uint64_t>(d)) << ScriptVal(d).ToText();
    }
    std::string read;
    for (const char *text : {"0x10", "0XfF", "0x1p4", "0x.8", "0xA.8P1", "0x7fffffffffffffff", "1E-2", "2.5e+3", ".5",
                             "5.", "- 3", "-0x10", "- 1 / 0", "1.0/0.0", "0/0", "3e-324", "1e-400", "-1e-400", "-0"})
        read += Parse(text).ToText() + " ";
    read += Parse("0." + std::string(400, '0') + "1").ToText();
    // 0x7fff... rounds to 2^63, 3e-324 to the smallest denormal; an underflow reads as zero with its sign.
    EXPECT_EQ(read, "16 255 16 0.5 21 9223372036854775808 0.01 2500 0.5 5 -3 -16 -1/0 1/0 0/0 5e-324 0 -0 -0 0");
    std::string writtenText;
    for (const std::string &text :
         {std::string(), std::string("say \"hi\" it's"), std::string("back\\slash"), std::string("a\nb\rc\td"),
          std::string("\0x", 2), std::string("\0001", 2), std::string("\x01\x1f\x7f"), std::string("\0339"),
          std::string("\xc3\xa9 \xff\x80")}) {
        writtenText += ScriptVal(text).ToText() + " ";
        EXPECT_EQ(Parse(ScriptVal(text).ToText()).AsText(), text);
    }
    // A decimal escape is padded to three digits where a digit follows; bytes from 0x80 stay as they are.
    EXPECT_EQ(writtenText, R"("" "say \"hi\" it's" "back\\slash" "a\nb\rc\td" "\0x" "\0001" "\1\31\127" "\0279" )"
                           "\"\xc3\xa9 \xff\x80\" ");
    std::string all;
    // A digit after each byte tests escape padding.
    for (int c = 0; c < 256; ++c) all.append({static_cast<char>(c), static_cast<char>('0' + c % 10)});
    EXPECT_EQ(Parse(ScriptVal(all).ToText()).AsText(), all);
    std::string readText;
    for (const std::string &text :
         {std::string(R"('it\'s "q"')"), std::string(R"("\a\b\f\n\r\t\v\\\"\'")"), std::string(R"("\65\066\0677\255")"),
          std::string(R"("a\0b")"), std::string("\"a\0b\"", 5), std::string("\"a\\\nb\\\r\nc\""),
          std::string("[[\n\nl1\r\nl2\rl3]]"), std::string("[==[a]]b]=]c]==]"), std::string(R"([[a\nb]])")})
        readText += Parse(text).ToText() + " ";
    // Line breaks in a text read as \n; only the one right after a long bracket is dropped.
    EXPECT_EQ(readText, R"("it's \"q\"" "\7\8\12\n\r\t\11\\\"'" "ABC7)"
                        "\xff"
                        R"(" "a\0b" "a\0b" "a\nb\nc" )"
                        R"("\nl1\nl2\nl3" "a]]b]=]c" "a\\nb" )");
}

TEST(ScriptValWrite, ScalarsSmallTablesAndTheOneLineLimit) {
    ScriptVal mixed = ScriptVal::Table();
    mixed.Append(1).Append(2).Set("x", 3);
    const ScriptVal keys = Make({{"not id", 1}, {"end", 2}, {1.5, 3}, {true, 4}, {kInf, 5}, {"_ok9", 7}});
    const std::pair<ScriptVal, std::string> cases[] = {
        {ScriptVal(), "nil"},
        {ScriptVal(false), "false"},
        {ScriptVal::Table("Orvane.Document"), "Orvane.Document {}"},
        {mixed, "{ 1, 2, x = 3 }"},
        {Make({{"x", 1}, {1, "a"}}), "{ x = 1, [1] = \"a\" }"},
        {Make({{1, 1}, {3, 3}, {-2, 6}}), "{ 1, [3] = 3, [-2] = 6 }"},
        {Make({{"Pos", ScriptVal::Ref("A.B")}}, "Point"), "Point { Pos = A.B }"},
        {keys, "{ [\"not id\"] = 1, [\"end\"] = 2, [1.5] = 3, [true] = 4, [1/0] = 5, _ok9 = 7 }"},
    };
    for (const auto &[value, text] : cases) EXPECT_EQ(std::pair(value.ToText(), Parse(text)), std::pair(text, value));
    // `{ "..." }` is the text length plus 6.
    ScriptVal fits = ScriptVal::Table(), tooLong = ScriptVal::Table();
    fits.Append(std::string(74, 'x'));
    EXPECT_EQ(fits.ToText(), "{ \"" + std::string(74, 'x') + "\" }");
    tooLong.Append(std::string(75, 'x'));
    EXPECT_EQ(tooLong.ToText(), "{\n\t\"" + std::string(75, 'x') + "\",\n}");
    // Starting two levels in indents every line after the first by two more tabs.
    EXPECT_EQ(tooLong.ToText(2), "{\n\t\t\t\"" + std::string(75, 'x') + "\",\n\t\t}");
    // A nested table always breaks the line, even an empty one.
    EXPECT_EQ(Make({{"t", ScriptVal::Table()}}).ToText(), "{\n\tt = {},\n}");
}

TEST(ScriptValPlaces, CommentsAndPlacesStayThroughARoundTrip) {
    const std::tuple<std::string, std::string, std::string> cases[] = {
        {"-- top\n-- two\n{ a = 1, -- on a\n  -- before b\n  b = { 1, 2 }, c = 3 -- on c\n}",
         "-- top\n-- two\n{\n\ta = 1, -- on a\n\t-- before b\n\tb = { 1, 2 },\n\tc = 3, -- on c\n}",
         " before: -- top\n before: -- two\n/\"a\" after: -- on a\n/\"b\" before: -- before b\n/\"c\" after: -- on "
         "c\n"},
        {"{ 1, -- one\n 2 }", "{\n\t1, -- one\n\t2,\n}", "/1 after: -- one\n"}, // never squeezed onto one line
        {"{ a = Doc.Inputs { --[[ two\nlines ]] b = 1 } }",
         "{\n\ta = Doc.Inputs {\n\t\t--[[ two\nlines ]]\n\t\tb = 1,\n\t},\n}",
         "/\"a\"/\"b\" before: --[[ two\nlines ]]\n"},
        {"--[[x]] -- y\n7", "--[[x]]\n-- y\n7", " before: --[[x]]\n before: -- y\n"},
        // Loose text: one comment after a '{' stands before the first entry, the one after the whole value goes.
        {"-- by hand\nreturn Orvane.Document{ --[[ a\n long comment ]] Tools={ 'a' ; [==[b]==], x=1.50, } ;\n"
         "  Link = Tool . Output ; [ [[key]] ] = 0x10 }; -- trailing comment",
         "-- by hand\nOrvane.Document {\n\t--[[ a\n long comment ]]\n\tTools = { \"a\", \"b\", x = 1.5 },\n"
         "\tLink = Tool.Output,\n\tkey = 16,\n}",
         " before: -- by hand\n/\"Tools\" before: --[[ a\n long comment ]]\n"},
    };
    for (const auto &[text, written, comments] : cases) {
        SCOPED_TRACE(text);
        const ScriptVal v = Parse(text), back = Parse(written);
        EXPECT_EQ(std::pair(CommentsOf(v), v.ToText()), std::pair(comments, written));
        EXPECT_EQ(std::tuple(back, CommentsOf(back), back.ToText()), std::tuple(v, comments, written));
        ExpectPlacesInText(back, written);
    }
    // Lines end at CR LF as well; columns count characters, not bytes. Values made in code have no place.
    const ScriptVal v = Parse("-- c\r\n{ \"\xc3\xa9\", y = -2 }");
    EXPECT_EQ(std::make_tuple(v.Line(), v.At(1)->Column(), v.Entries()[1].first.Column(), v.Find("y")->Column()),
              std::make_tuple(2, 3, 8, 12));
    EXPECT_EQ(std::make_pair(ScriptVal(1).Line(), ScriptVal(1).Column()), std::make_pair(0, 0));
}

// What loose text means, shown as the canonical text of what was read.
TEST(ScriptValParse, StructureAndRepeatedKeysNotedWithBothPlaces) {
    std::string read;
    for (const std::string text :
         {"  true  ", "\xEF\xBB\xBF{ a = 1 }", "{ 'a', x = 1, 'b', [10] = 'j', 'c' }", "{ [1] = 'a', 'b' }",
          "{ 'b', [1] = 'a' }", "{ a = 1, b = 2, a = 3 }", "{ nil, 2 }", "{ a = 1, b = 2, a = nil, a = 3 }",
          "{ ['x'] = 1, [2.5] = 2, [false] = 3, [-1/0] = 4 }", "Tool1", "a . b .c", "Merge -- c\n{ x = y.z }",
          "{ ends = 1, nil_ = 2, If = 3 }", "--[==[ ]] ]==] -- line\n--[ not long\n{ --[[x]] 1 --[[y]] }"})
        read += Parse(text).ToText() + "\n";
    EXPECT_EQ(read, "true\n{ a = 1 }\n{ \"a\", x = 1, [2] = \"b\", [10] = \"j\", [3] = \"c\" }\n{ \"b\" }\n{ \"a\" }\n"
                    "{ a = 3, b = 2 }\n{ [2] = 2 }\n{ b = 2, a = 3 }\n{ x = 1, [2.5] = 2, [false] = 3, [-1/0] = 4 }\n"
                    "Tool1\na.b.c\nMerge { x = y.z }\n{ ends = 1, nil_ = 2, If = 3 }\n"
                    "--[==[ ]] ]==]\n-- line\n--[ not long\n{\n\t--[[x]]\n\t1, --[[y]]\n}\n");
    // Tables nest 256 deep (deeper is refused, below).
    const ScriptVal deep = Parse(std::string(256, '{') + std::string(256, '}'));
    int depth = 1;
    for (const ScriptVal *p = &deep; p->Size() == 1; p = p->At(1)) ++depth;
    EXPECT_EQ(depth, 256);
    EXPECT_EQ(Parse(deep.ToText()), deep);
    std::string many = "{ ";
    for (int i = 1; i <= 20; ++i) many += "k" + std::to_string(i) + " = 1, "; // past the size where keys are indexed
    const std::pair<std::string, std::vector<std::string>> cases[] = {
        {"{ a = 1,\n  a = 2 }", {"line 2, column 3: 'a' is given twice (first at line 1)"}},
        {"{ ['a b'] = 1, [2.5] = 2,\n[\"a b\"] = 3, [true] = 0, [2.5] = 4, [true] = 1 }",
         {"line 2, column 2: [\"a b\"] is given twice (first at line 1)",
          "line 2, column 27: [2.5] is given twice (first at line 1)",
          "line 2, column 38: [true] is given twice (first at line 2)"}},
        {"{ a = 1, a = nil, a = 3 }", {"line 1, column 10: 'a' is given twice (first at line 1)"}},
        {"{ a = 1, t = { a = 2 } }", {}},
        {"{ [1] = 'a',\n 'b' }", {"line 2, column 2: [1] is given twice (first at line 1)"}},
        {many + "\n\n k7 = 2 }", {"line 3, column 2: 'k7' is given twice (first at line 1)"}},
    };
    for (const auto &[text, want] : cases) {
        std::vector<ScriptParseError> notes;
        EXPECT_EQ(ScriptVal::FromText(text, &notes), Parse(text));
        std::vector<std::string> got;
        for (const ScriptParseError &n : notes) got.push_back(n.what());
        EXPECT_EQ(got, want) << text;
    }
}

// Many fields with repeats and removals: the parsed table matches the same fields applied through Set, and every key
// given again is noted once.
TEST(ScriptValParse, LargeTablesFollowSetSemantics) {
    std::mt19937 rng(7);
    for (int round = 0; round < 10; ++round) {
        std::string text = "{";
        ScriptVal expected = ScriptVal::Table();
        int positional = 0;
        size_t repeats = 0;
        for (int i = 0; i < 400; ++i) {
            const int kind = static_cast<int>(rng() % 4), n = static_cast<int>(rng() % 60);
            const bool nil = rng() % 8 == 0;
            const std::string value = nil ? "nil" : std::to_string(i), name = "k" + std::to_string(n);
            const ScriptVal key = kind == 0 ? ScriptVal(name) : kind == 1 ? ScriptVal(n) : ScriptVal(++positional);
            text += kind == 0 ? name + " = " : kind == 1 ? "[" + std::to_string(n) + "] = " : "";
            text += value + (kind == 2 ? "; " : ", ");
            repeats += expected.Find(key) != nullptr;
            expected.Set(key, nil ? ScriptVal() : ScriptVal(i));
        }
        std::vector<ScriptParseError> notes;
        const ScriptVal parsed = ScriptVal::FromText(text + "}", &notes);
        ASSERT_EQ(parsed, expected) << "round " << round;
        ASSERT_EQ(parsed.ArrayLength(), expected.ArrayLength());
        ASSERT_EQ(notes.size(), repeats);
    }
}

TEST(ScriptValParse, ErrorPositions) {
    const std::string deep = std::string(256, '{') + std::string(256, '}');
    const std::tuple<std::string, int, int, std::string> cases[] = {
        {"{" + deep + "}", 1, 257, "nesting too deep"},
        {"A{" + deep + "}", 1, 258, "nesting too deep"},
        {std::string(1000000, '{'), 1, 257, "nesting too deep"},
        {"{\n" + deep, 2, 256, "nesting too deep"},
        {"{ a = \"abc", 1, 7, "unfinished string"},
        {"{\n  a = 'x\n' }", 2, 7, "unfinished string"},
        {"\"abc\\", 1, 1, "unfinished string"},
        {"{\n  a = 1,\n  b = 2\n", 4, 1, "expected '}' to close table opened at line 1"},
        {"{\n\n  t = {\n 1 2", 4, 4, "expected '}' to close table opened at line 3"},
        {"{ a = 1 } x", 1, 11, "unexpected name 'x' after the value"},
        {"{}\n}", 2, 1, "unexpected symbol '}'"},
        {"1 2", 1, 3, "unexpected number after the value"},
        {"os.exit()", 1, 8, "function calls are not allowed"},
        {"{ require 'io' }", 1, 11, "function calls are not allowed"},
        {"{ x = 1 + 2 }", 1, 9, "unexpected symbol '+'"},
        {"{ 1/2 }", 1, 4, "division is only allowed as 1/0, -1/0 or 0/0"},
        {"2/0", 1, 2, "division is only allowed as 1/0, -1/0 or 0/0"},
        {"1/-0", 1, 2, "division is only allowed as 1/0, -1/0 or 0/0"},
        {"-x", 1, 1, "'-' must be followed by a number"},
        {"function() end", 1, 1, "unexpected 'function'"},
        {"{ end = 1 }", 1, 3, "unexpected 'end'"},
        {"", 1, 1, "unexpected end of text"},
        {"  -- nothing", 1, 13, "unexpected end of text"},
        {"{ , }", 1, 3, "unexpected symbol ','"},
        {"a.", 1, 3, "expected a name after '.'"},
        {"a.end", 1, 3, "expected a name after '.'"},
        {"{ 1e400 }", 1, 3, "number out of range"},
        {"0x1p99999", 1, 1, "number out of range"},
        {"3x", 1, 1, "malformed number near '3x'"},
        {"1.2.3", 1, 1, "malformed number near '1.2.3'"},
        {"1e+", 1, 1, "malformed number near '1e+'"},
        {"0x", 1, 1, "malformed number near '0x'"},
        {"'a\\qb'", 1, 3, "invalid escape sequence '\\q'"},
        {"\"\\256\"", 1, 2, "decimal escape too large"},
        {"\n[==[ x ]=]", 2, 1, "unfinished long string"},
        {"1 --[[ x", 1, 3, "unfinished long comment"},
        {"[=x", 1, 1, "invalid long string delimiter"},
        {"{ [nil] = 1 }", 1, 4, "table key cannot be nil"},
        {"{ [0/0] = 1 }", 1, 4, "table key cannot be NaN"},
        {"{ [{}] = 1 }", 1, 4, "table key must be a number, text or boolean"},
        {"{ [x] = 1 }", 1, 4, "table key must be a number, text or boolean"},
        {"{ [1 = 2 }", 1, 6, "expected ']' after table key"},
        {"{ [1] 2 }", 1, 7, "expected '=' after table key"},
        {std::string("{ \0 }", 5), 1, 3, "unexpected byte 0x00"},
        {"{ \"\xc3\xbc\xe2\x9c\x93\" + }", 1, 8, "unexpected symbol '+'"},
        {"{\r\n a = 1\r\n +", 3, 2, "unexpected symbol '+'"},
        {"{\r\r+", 3, 1, "unexpected symbol '+'"}};
    for (const auto &[text, line, column, message] : cases) {
        try {
            ADD_FAILURE() << "parsed without error as: " << Parse(text).ToText();
        } catch (const ScriptParseError &e) {
            EXPECT_EQ(std::make_tuple(e.Line(), e.Column(), e.Message()), std::make_tuple(line, column, message))
                << text;
            EXPECT_EQ(e.what(), "line " + std::to_string(line) + ", column " + std::to_string(column) + ": " + message);
        }
    }
}

// Mutated documents either parse or fail with a ScriptParseError. Whatever parses writes text that reads back to an
// equal value with the same comments, every value placed where its text stands.
TEST(ScriptValParse, MutatedTextNeverCrashes) {
    const std::vector<std::string> seeds = {
        "return Orvane.Document {\n\tTools = {\n\t\tB = Background { Inputs = { W = 1920, C = { 0.1, 1/0 } } },\n"
        "\t\t-- merge\n\t\tM = Merge { Inputs = { Bg = B.Output, ['x y'] = [==[long]==] } }, -- after\n\t},\n}\n",
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
        for (int m = 1 + static_cast<int>(rng() % 4); m > 0 && !text.empty(); --m) {
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
            const std::string written = v.ToText();
            const ScriptVal back = ScriptVal::FromText(written);
            ASSERT_EQ(back, v) << "iteration " << iter;
            ASSERT_EQ(CommentsOf(back), CommentsOf(v)) << "iteration " << iter;
            ASSERT_NO_FATAL_FAILURE(ExpectPlacesInText(back, written)) << "iteration " << iter;
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
