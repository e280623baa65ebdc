#include "host/core/ScriptVal.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <functional>
#include <limits>
#include <unordered_map>
#include <unordered_set>

namespace Orvane {
namespace scriptval_impl {
namespace {

// Tables nested deeper than this are refused, so hostile text cannot exhaust the stack.
constexpr int kMaxDepth = 256;
// A table of scalars whose one-line form is at most this long stays on one line.
constexpr size_t kOneLineLimit = 80;
// Integral numbers below this magnitude are written as plain digits (100000, not 1e+05).
constexpr double kPlainIntegerLimit = 9007199254740992.0; // 2^53

constexpr std::string_view kKeywords[] = {"and",      "break",  "do",   "else", "elseif", "end",  "false", "for",
                                          "function", "goto",   "if",   "in",   "local",  "nil",  "not",   "or",
                                          "repeat",   "return", "then", "true", "until",  "while"};

bool IsAlpha(char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_'; }
bool IsDigit(char c) { return c >= '0' && c <= '9'; }
bool IsAlnum(char c) { return IsAlpha(c) || IsDigit(c); }
bool IsHexDigit(char c) { return IsDigit(c) || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F'); }

bool IsKeyword(std::string_view s) {
    for (std::string_view k : kKeywords)
        if (s == k) return true;
    return false;
}

// An identifier that may be written bare: letters, digits and '_', not starting with a digit, not a keyword.
bool IsName(std::string_view s) {
    if (s.empty() || !IsAlpha(s[0])) return false;
    for (char c : s)
        if (!IsAlnum(c)) return false;
    return !IsKeyword(s);
}

// Names joined by dots: `Tool`, `Background1.Output`, `Orvane.Document`.
bool IsDottedPath(std::string_view s) {
    if (s.empty()) return false;
    for (;;) {
        const size_t dot = s.find('.');
        if (!IsName(s.substr(0, dot))) return false;
        if (dot == std::string_view::npos) return true;
        s.remove_prefix(dot + 1);
    }
}

bool IsNumberKey(const ScriptVal &key, size_t oneBased) {
    return key.IsNumber() && key.AsNumber() == static_cast<double>(oneBased);
}

bool ValidKey(const ScriptVal &key) {
    return key.IsBool() || key.IsText() || (key.IsNumber() && !std::isnan(key.AsNumber()));
}

// ---- writing ----

void WriteNumber(std::string &out, double d) {
    if (std::isnan(d)) {
        out += "0/0";
        return;
    }
    if (std::isinf(d)) {
        out += d > 0 ? "1/0" : "-1/0";
        return;
    }
    char buf[64];
    const bool plainInteger = d == std::trunc(d) && std::fabs(d) < kPlainIntegerLimit;
    const auto res = plainInteger ? std::to_chars(buf, buf + sizeof buf, d, std::chars_format::fixed)
                                  : std::to_chars(buf, buf + sizeof buf, d);
    out.append(buf, res.ptr);
}

void WriteQuoted(std::string &out, std::string_view s) {
    out += '"';
    for (size_t i = 0; i < s.size(); ++i) {
        const unsigned char c = static_cast<unsigned char>(s[i]);
        switch (c) {
        case '"': out += "\\\""; break;
        case '\\': out += "\\\\"; break;
        case '\n': out += "\\n"; break;
        case '\r': out += "\\r"; break;
        case '\t': out += "\\t"; break;
        default:
            if (c < 0x20 || c == 0x7f) {
                // Decimal escape; padded to three digits when a digit follows, so it reads back unchanged.
                char buf[8];
                const bool digitFollows = i + 1 < s.size() && IsDigit(s[i + 1]);
                const int n =
                    std::snprintf(buf, sizeof buf, digitFollows ? "\\%03u" : "\\%u", static_cast<unsigned>(c));
                out.append(buf, static_cast<size_t>(n));
            } else {
                out += static_cast<char>(c);
            }
        }
    }
    out += '"';
}

void CheckPath(const std::string &path, const char *what) {
    if (!IsDottedPath(path)) throw std::invalid_argument(std::string("ScriptVal: invalid ") + what + " '" + path + "'");
}

void WriteKey(std::string &out, const ScriptVal &key) {
    if (key.IsText() && IsName(key.AsText())) {
        out += key.AsText();
    } else {
        out += '[';
        if (key.IsText())
            WriteQuoted(out, key.AsText());
        else if (key.IsNumber())
            WriteNumber(out, key.AsNumber());
        else
            out += key.AsBool() ? "true" : "false";
        out += ']';
    }
    out += " = ";
}

// A key as messages name it: 'Gain', [3], ["two words"].
std::string KeyText(const ScriptVal &key) {
    if (key.IsText() && IsName(key.AsText())) return "'" + key.AsText() + "'";
    std::string out;
    WriteKey(out, key);
    out.resize(out.size() - 3); // the " = "
    return out;
}

// Number of leading entries whose keys are 1, 2, ... in order; these are written without keys.
size_t LeadingArray(const std::vector<ScriptVal::Entry> &entries) {
    size_t n = 0;
    while (n < entries.size() && IsNumberKey(entries[n].first, n + 1)) ++n;
    return n;
}

void WriteValue(std::string &out, const ScriptVal &v, int indent);

// A value's comments, one line each at the indentation (the lines inside a long comment stay as written).
void WriteComments(std::string &out, const ScriptVal &v, int indent) {
    for (const std::string &comment : v.Comments()) {
        out.append(static_cast<size_t>(indent), '\t');
        out += comment;
        out += '\n';
    }
}

// Writes `{ a, b, k = v }` if the table holds only scalars and fits the one-line limit; returns false otherwise,
// leaving out as it was.
bool WriteOneLine(std::string &out, const ScriptVal &table) {
    const auto &entries = table.Entries();
    for (const auto &e : entries)
        if (e.second.IsTable() || !e.second.Comments().empty() || !e.second.TrailingComment().empty()) return false;
    const size_t start = out.size();
    const size_t limit = start + kOneLineLimit;
    if (!table.ClassName().empty()) {
        out += table.ClassName();
        out += ' ';
    }
    out += "{ ";
    const size_t array = LeadingArray(entries);
    for (size_t i = 0; i < entries.size(); ++i) {
        if (i > 0) out += ", ";
        if (i >= array) WriteKey(out, entries[i].first);
        WriteValue(out, entries[i].second, 0);
        if (out.size() > limit) {
            out.resize(start);
            return false;
        }
    }
    out += " }";
    if (out.size() > limit) {
        out.resize(start);
        return false;
    }
    return true;
}

void WriteTable(std::string &out, const ScriptVal &table, int indent) {
    if (!table.ClassName().empty()) CheckPath(table.ClassName(), "class name");
    const auto &entries = table.Entries();
    if (entries.empty()) {
        if (!table.ClassName().empty()) {
            out += table.ClassName();
            out += ' ';
        }
        out += "{}";
        return;
    }
    if (WriteOneLine(out, table)) return;
    if (!table.ClassName().empty()) {
        out += table.ClassName();
        out += ' ';
    }
    out += "{\n";
    const size_t array = LeadingArray(entries);
    for (size_t i = 0; i < entries.size(); ++i) {
        WriteComments(out, entries[i].second, indent + 1);
        out.append(static_cast<size_t>(indent + 1), '\t');
        if (i >= array) WriteKey(out, entries[i].first);
        WriteValue(out, entries[i].second, indent + 1);
        out += ',';
        if (!entries[i].second.TrailingComment().empty()) {
            out += ' ';
            out += entries[i].second.TrailingComment();
        }
        out += '\n';
    }
    out.append(static_cast<size_t>(indent), '\t');
    out += '}';
}

void WriteValue(std::string &out, const ScriptVal &v, int indent) {
    switch (v.GetType()) {
    case ScriptVal::Type::Nil: out += "nil"; break;
    case ScriptVal::Type::Bool: out += v.AsBool() ? "true" : "false"; break;
    case ScriptVal::Type::Number: WriteNumber(out, v.AsNumber()); break;
    case ScriptVal::Type::Text: WriteQuoted(out, v.AsText()); break;
    case ScriptVal::Type::ObjectRef:
        CheckPath(v.AsText(), "object reference");
        out += v.AsText();
        break;
    case ScriptVal::Type::Table: WriteTable(out, v, indent); break;
    }
}

// ---- reading ----

struct Token {
    enum Kind { End, Name, Number, String, Symbol };
    Kind kind = End;
    size_t pos = 0;                    // byte offset of the first character
    std::vector<std::string> comments; // the comments on the lines before the token
    std::string trailing;              // a comment on the line of the token before
    std::string_view name;             // Name: the identifier
    double number = 0.0;               // Number
    std::string text;                  // String: the decoded contents
    char symbol = 0;                   // Symbol: the character
};

std::string Describe(const Token &t) {
    switch (t.kind) {
    case Token::End: return "end of text";
    case Token::Number: return "number";
    case Token::String: return "text";
    case Token::Name:
        if (IsKeyword(t.name)) return "'" + std::string(t.name) + "'";
        return "name '" + std::string(t.name) + "'";
    case Token::Symbol: break;
    }
    const unsigned char c = static_cast<unsigned char>(t.symbol);
    if (c > 0x20 && c < 0x7f) return std::string("symbol '") + t.symbol + "'";
    char buf[16];
    std::snprintf(buf, sizeof buf, "byte 0x%02x", static_cast<unsigned>(c));
    return buf;
}

// Key of a table entry as a hashable string: kind tag plus contents. 0 and -0 share a key.
std::string IndexKey(const ScriptVal &key) {
    std::string k;
    if (key.IsText()) {
        k.reserve(key.AsText().size() + 1);
        k += 't';
        k += key.AsText();
    } else if (key.IsNumber()) {
        const double d = key.AsNumber() == 0.0 ? 0.0 : key.AsNumber();
        char bytes[sizeof d];
        std::memcpy(bytes, &d, sizeof d);
        k += 'n';
        k.append(bytes, sizeof bytes);
    } else {
        k = key.AsBool() ? "b1" : "b0";
    }
    return k;
}

// Collects the fields of one table while it is parsed, with the semantics of ScriptVal::Set applied in order
// (a later value for a key wins; nil removes), without a linear search for every field.
template <class Make> class TableBuilder {
public:
    std::vector<ScriptVal::Entry> entries;
    // Called with the earlier key and the new one when a key is given again.
    std::function<void(const ScriptVal &, const ScriptVal &)> onRepeat;

    void Positional(ScriptVal value) {
        ++positional_;
        ScriptVal key(static_cast<double>(positional_));
        Make::Place(key, value.Line(), value.Column()); // a positional key stands where its value does
        // Positional keys only grow, so until a keyed field appears none can already exist.
        if (!keyed_) {
            if (!value.IsNil()) entries.emplace_back(std::move(key), std::move(value));
            return;
        }
        Put(std::move(key), std::move(value));
    }

    void Keyed(ScriptVal key, ScriptVal value) {
        keyed_ = true;
        Put(std::move(key), std::move(value));
    }

    // Drops removed entries; returns the length of the leading 1..n run.
    size_t Finish() {
        if (removed_) std::erase_if(entries, [](const ScriptVal::Entry &e) { return e.second.IsNil(); });
        return LeadingArray(entries);
    }

private:
    static constexpr size_t kLinearLimit = 16;
    size_t positional_ = 0;
    bool keyed_ = false;
    bool removed_ = false; // entries with a nil value are removed ones, dropped by Finish
    bool indexed_ = false;
    std::unordered_map<std::string, size_t> index_;

    void Put(ScriptVal key, ScriptVal value) {
        if (!indexed_ && entries.size() >= kLinearLimit) {
            for (size_t i = 0; i < entries.size(); ++i)
                if (!entries[i].second.IsNil()) index_[IndexKey(entries[i].first)] = i;
            indexed_ = true;
        }
        if (indexed_) {
            std::string k = IndexKey(key);
            const auto it = index_.find(k);
            if (it != index_.end()) {
                const size_t at = it->second;
                if (onRepeat) onRepeat(entries[at].first, key);
                if (value.IsNil()) {
                    removed_ = true;
                    index_.erase(it);
                }
                entries[at].second = std::move(value);
                return;
            }
            if (value.IsNil()) return;
            index_.emplace(std::move(k), entries.size());
            entries.emplace_back(std::move(key), std::move(value));
            return;
        }
        for (auto &e : entries) {
            if (!e.second.IsNil() && e.first == key) {
                if (onRepeat) onRepeat(e.first, key);
                if (value.IsNil()) removed_ = true;
                e.second = std::move(value);
                return;
            }
        }
        if (!value.IsNil()) entries.emplace_back(std::move(key), std::move(value));
    }
};

// Reads one value from script text. Values with unchecked contents come from Make (ScriptVal::Builder), which
// may fill a table's storage directly.
template <class Make> class Reader {
public:
    Reader(std::string_view src, std::vector<ScriptParseError> *notes) : src_(src), notes_(notes) {}

    ScriptVal Document() {
        Next();
        std::vector<std::string> leading = std::move(cur_.comments);
        const bool hasReturn = cur_.kind == Token::Name && cur_.name == "return";
        if (hasReturn) Next();
        ScriptVal v = Value();
        v.SetComments(std::move(leading));
        if (hasReturn && IsSymbol(';')) Next();
        if (cur_.kind != Token::End) {
            if (cur_.kind == Token::Symbol) Fail(cur_.pos, "unexpected " + Describe(cur_));
            Fail(cur_.pos, "unexpected " + Describe(cur_) + " after the value");
        }
        return v;
    }

private:
    std::string_view src_;
    std::vector<ScriptParseError> *notes_;
    size_t p_ = 0; // lexer position
    Token cur_, ahead_;
    bool hasAhead_ = false;
    int depth_ = 0;
    std::vector<std::string> pendingComments_; // skipped since the last token
    std::string pendingTrailing_;              // a comment on the last token's line
    bool lexedAny_ = false;
    // The last position worked out; positions are mostly asked in increasing order.
    size_t knownOffset_ = 0;
    int knownLine_ = 1, knownColumn_ = 1;

    // ---- positions and errors ----

    // Line and column of a byte offset. Columns count characters: UTF-8 continuation bytes do not advance them.
    std::pair<int, int> Position(size_t offset) {
        offset = std::min(offset, src_.size());
        if (offset < knownOffset_) knownOffset_ = 0, knownLine_ = 1, knownColumn_ = 1;
        int line = knownLine_, column = knownColumn_;
        for (size_t i = knownOffset_; i < offset; ++i) {
            const unsigned char c = static_cast<unsigned char>(src_[i]);
            if (c == '\n' || (c == '\r' && (i + 1 >= src_.size() || src_[i + 1] != '\n'))) {
                ++line;
                column = 1;
            } else if (c != '\r' && (c & 0xC0) != 0x80) {
                ++column;
            }
        }
        knownOffset_ = offset, knownLine_ = line, knownColumn_ = column;
        return {line, column};
    }

    ScriptVal Placed(ScriptVal v, size_t offset) {
        const auto [line, column] = Position(offset);
        Make::Place(v, line, column);
        return v;
    }

    [[noreturn]] void Fail(size_t offset, const std::string &message) {
        const auto [line, column] = Position(offset);
        throw ScriptParseError(line, column, message);
    }

    // ---- lexer ----

    char At(size_t i) const { return i < src_.size() ? src_[i] : '\0'; }

    // At '[': the level of a long bracket `[==[` (number of '='), -1 for a plain '[', -2 for '[=' with no second '['.
    int LongBracketLevel(size_t at) const {
        size_t i = at + 1;
        while (i < src_.size() && src_[i] == '=') ++i;
        if (i < src_.size() && src_[i] == '[') return static_cast<int>(i - at - 1);
        return i == at + 1 ? -1 : -2;
    }

    // Reads a long bracket body starting at the opening '['; returns the contents with line breaks as '\n'.
    // p_ ends past the closing bracket.
    // Errors are reported at errorAt: the bracket itself, or the `--` of a long comment.
    std::string LongBracket(size_t open, int level, const char *unfinished, size_t errorAt) {
        size_t i = open + static_cast<size_t>(level) + 2;
        // A line break right after the opening bracket is not part of the text.
        if (At(i) == '\r' || At(i) == '\n') {
            const char first = src_[i++];
            if ((At(i) == '\r' || At(i) == '\n') && At(i) != first) ++i;
        }
        std::string text;
        for (;;) {
            const size_t stop = src_.find_first_of(std::string_view("]\r\n", 3), i);
            if (stop == std::string_view::npos) Fail(errorAt, unfinished);
            text.append(src_.substr(i, stop - i));
            i = stop;
            const char c = src_[i];
            if (c == ']') {
                size_t j = i + 1;
                while (j < src_.size() && src_[j] == '=') ++j;
                if (j < src_.size() && src_[j] == ']' && j - i - 1 == static_cast<size_t>(level)) {
                    p_ = j + 1;
                    return text;
                }
                text += ']';
                ++i;
            } else {
                ++i;
                if ((At(i) == '\r' || At(i) == '\n') && At(i) != c) ++i;
                text += '\n';
            }
        }
    }

    // A comment that starts on the line of the token before belongs to that token's entry.
    void KeepComment(size_t start, bool afterLineBreak) {
        std::string text(src_.substr(start, p_ - start));
        if (!afterLineBreak && lexedAny_ && pendingTrailing_.empty() && pendingComments_.empty())
            pendingTrailing_ = std::move(text);
        else
            pendingComments_.push_back(std::move(text));
    }

    void SkipSpace() {
        bool newLine = false;
        while (p_ < src_.size()) {
            const char c = src_[p_];
            if (c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\v' || c == '\f') {
                if (c == '\n' || c == '\r') newLine = true;
                ++p_;
            } else if (c == '-' && At(p_ + 1) == '-') {
                const size_t start = p_;
                p_ += 2;
                if (At(p_) == '[') {
                    const int level = LongBracketLevel(p_);
                    if (level >= 0) {
                        LongBracket(p_, level, "unfinished long comment", start);
                        KeepComment(start, newLine);
                        continue;
                    }
                }
                while (p_ < src_.size() && src_[p_] != '\n' && src_[p_] != '\r') ++p_;
                KeepComment(start, newLine);
            } else {
                break;
            }
        }
    }

    void LexNumber(Token &t) {
        const size_t start = p_;
        size_t i = p_;
        bool ok = true;
        double value = 0.0;
        if (src_[i] == '0' && (At(i + 1) == 'x' || At(i + 1) == 'X')) {
            i += 2;
            const size_t digits = i;
            size_t count = 0;
            while (IsHexDigit(At(i))) ++i, ++count;
            if (At(i) == '.') {
                ++i;
                while (IsHexDigit(At(i))) ++i, ++count;
            }
            if (count == 0) ok = false;
            if (At(i) == 'p' || At(i) == 'P') {
                ++i;
                if (At(i) == '+' || At(i) == '-') ++i;
                if (!IsDigit(At(i))) ok = false;
                while (IsDigit(At(i))) ++i;
            }
            if (ok) {
                const auto res = std::from_chars(src_.data() + digits, src_.data() + i, value, std::chars_format::hex);
                if (res.ptr != src_.data() + i)
                    ok = false;
                else if (res.ec == std::errc::result_out_of_range)
                    value = OutOfRange(start, i, true);
            }
        } else {
            while (IsDigit(At(i))) ++i;
            if (At(i) == '.') {
                ++i;
                while (IsDigit(At(i))) ++i;
            }
            if (At(i) == 'e' || At(i) == 'E') {
                ++i;
                if (At(i) == '+' || At(i) == '-') ++i;
                if (!IsDigit(At(i))) ok = false;
                while (IsDigit(At(i))) ++i;
            }
            if (ok) {
                const auto res = std::from_chars(src_.data() + start, src_.data() + i, value);
                if (res.ptr != src_.data() + i)
                    ok = false;
                else if (res.ec == std::errc::result_out_of_range)
                    value = OutOfRange(start, i, false);
            }
        }
        // A number runs into no letter, digit or dot: `3x`, `1.2.3` and `1e` are malformed.
        if (IsAlnum(At(i)) || At(i) == '.') ok = false;
        if (!ok) {
            while (IsAlnum(At(i)) || At(i) == '.') ++i;
            std::string near(src_.substr(start, std::min<size_t>(i - start, 24)));
            Fail(start, "malformed number near '" + near + "'");
        }
        t.kind = Token::Number;
        t.number = value;
        p_ = i;
    }

    // from_chars reports both overflow and underflow as out of range. Underflow reads as zero; overflow is an error.
    // The literal is at least 1 in magnitude when its first significant digit sits at or above the units place.
    double OutOfRange(size_t start, size_t end, bool hex) {
        std::string_view lit = src_.substr(start, end - start);
        if (hex) lit.remove_prefix(2);
        size_t expAt = lit.find_first_of(hex ? std::string_view("pP") : std::string_view("eE"));
        long long exponent = 0;
        if (expAt != std::string_view::npos) {
            size_t k = expAt + 1;
            bool negative = false;
            if (lit[k] == '+' || lit[k] == '-') negative = lit[k++] == '-';
            for (; k < lit.size(); ++k) exponent = std::min<long long>(exponent * 10 + (lit[k] - '0'), 1000000000);
            if (negative) exponent = -exponent;
        }
        const std::string_view mantissa = lit.substr(0, expAt);
        const size_t dot = std::min(mantissa.find('.'), mantissa.size());
        // Position of the first nonzero digit relative to the units place, in digits.
        long long magnitude = 0;
        bool found = false;
        for (size_t k = 0; k < mantissa.size() && !found; ++k) {
            if (mantissa[k] == '.' || mantissa[k] == '0') continue;
            found = true;
            magnitude = k < dot ? static_cast<long long>(dot - k - 1) : -static_cast<long long>(k - dot);
        }
        if (hex) magnitude *= 4;
        if (found && magnitude + exponent >= 0) Fail(start, "number out of range");
        return 0.0;
    }

    void LexQuoted(Token &t) {
        const size_t start = p_;
        const char quote = src_[p_++];
        std::string text;
        for (;;) {
            size_t run = p_;
            while (run < src_.size() && src_[run] != quote && src_[run] != '\\' && src_[run] != '\n' &&
                   src_[run] != '\r')
                ++run;
            text.append(src_.substr(p_, run - p_));
            p_ = run;
            if (p_ >= src_.size() || src_[p_] == '\n' || src_[p_] == '\r') Fail(start, "unfinished string");
            if (src_[p_] == quote) {
                ++p_;
                break;
            }
            // An escape.
            const size_t escape = p_++;
            if (p_ >= src_.size()) Fail(start, "unfinished string");
            const char c = src_[p_];
            switch (c) {
            case 'a': text += '\a', ++p_; break;
            case 'b': text += '\b', ++p_; break;
            case 'f': text += '\f', ++p_; break;
            case 'n': text += '\n', ++p_; break;
            case 'r': text += '\r', ++p_; break;
            case 't': text += '\t', ++p_; break;
            case 'v': text += '\v', ++p_; break;
            case '\\': text += '\\', ++p_; break;
            case '"': text += '"', ++p_; break;
            case '\'': text += '\'', ++p_; break;
            case '\n':
            case '\r':
                ++p_;
                if ((At(p_) == '\n' || At(p_) == '\r') && At(p_) != c) ++p_;
                text += '\n';
                break;
            default:
                if (IsDigit(c)) {
                    unsigned value = 0;
                    for (int k = 0; k < 3 && IsDigit(At(p_)); ++k)
                        value = value * 10 + static_cast<unsigned>(src_[p_++] - '0');
                    if (value > 255) Fail(escape, "decimal escape too large");
                    text += static_cast<char>(value);
                } else {
                    const unsigned char u = static_cast<unsigned char>(c);
                    if (u > 0x20 && u < 0x7f) Fail(escape, std::string("invalid escape sequence '\\") + c + "'");
                    Fail(escape, "invalid escape sequence");
                }
            }
        }
        t.kind = Token::String;
        t.text = std::move(text);
    }

    void Lex(Token &t) {
        SkipSpace();
        t.comments = std::move(pendingComments_);
        pendingComments_.clear();
        t.trailing = std::move(pendingTrailing_);
        pendingTrailing_.clear();
        lexedAny_ = true;
        t.pos = p_;
        if (p_ >= src_.size()) {
            t.kind = Token::End;
            return;
        }
        const char c = src_[p_];
        if (IsAlpha(c)) {
            size_t i = p_ + 1;
            while (IsAlnum(At(i))) ++i;
            t.kind = Token::Name;
            t.name = src_.substr(p_, i - p_);
            p_ = i;
        } else if (IsDigit(c) || (c == '.' && IsDigit(At(p_ + 1)))) {
            LexNumber(t);
        } else if (c == '"' || c == '\'') {
            LexQuoted(t);
        } else if (c == '[' && LongBracketLevel(p_) != -1) {
            const int level = LongBracketLevel(p_);
            if (level < 0) Fail(p_, "invalid long string delimiter");
            t.text = LongBracket(p_, level, "unfinished long string", p_);
            t.kind = Token::String;
        } else {
            t.kind = Token::Symbol;
            t.symbol = c;
            ++p_;
        }
    }

    void Next() {
        if (hasAhead_) {
            std::swap(cur_, ahead_);
            hasAhead_ = false;
        } else {
            Lex(cur_);
        }
    }

    const Token &Peek() {
        if (!hasAhead_) {
            Lex(ahead_);
            hasAhead_ = true;
        }
        return ahead_;
    }

    bool IsSymbol(char c) const { return cur_.kind == Token::Symbol && cur_.symbol == c; }

    // ---- grammar ----

    ScriptVal Value() {
        // The place first: positions are worked out moving forward through the text.
        const auto [line, column] = Position(cur_.pos);
        ScriptVal v = UnplacedValue();
        Make::Place(v, line, column);
        return v;
    }

    ScriptVal UnplacedValue() {
        switch (cur_.kind) {
        case Token::Number: return NumberValue(cur_.number);
        case Token::String: {
            ScriptVal v(std::move(cur_.text));
            Next();
            return v;
        }
        case Token::Name: {
            if (cur_.name == "true" || cur_.name == "false") {
                ScriptVal v(cur_.name == "true");
                Next();
                return v;
            }
            if (cur_.name == "nil") {
                Next();
                return ScriptVal();
            }
            if (IsKeyword(cur_.name)) Fail(cur_.pos, "unexpected " + Describe(cur_));
            return NameValue();
        }
        case Token::Symbol:
            if (cur_.symbol == '{') return TableValue(std::string());
            if (cur_.symbol == '-') {
                const size_t minus = cur_.pos;
                Next();
                if (cur_.kind != Token::Number) Fail(minus, "'-' must be followed by a number");
                return NumberValue(-cur_.number);
            }
            Fail(cur_.pos, "unexpected " + Describe(cur_));
        case Token::End: break;
        }
        Fail(cur_.pos, "unexpected end of text");
    }

    // A number (already negated if a '-' preceded it), and the division forms 1/0, -1/0 and 0/0.
    ScriptVal NumberValue(double n) {
        Next();
        if (!IsSymbol('/')) return ScriptVal(n);
        const size_t slash = cur_.pos;
        Next();
        if (cur_.kind != Token::Number || cur_.number != 0.0 || !(n == 1.0 || n == -1.0 || n == 0.0))
            Fail(slash, "division is only allowed as 1/0, -1/0 or 0/0");
        Next();
        if (n == 0.0) return ScriptVal(std::numeric_limits<double>::quiet_NaN());
        return ScriptVal(n > 0 ? std::numeric_limits<double>::infinity() : -std::numeric_limits<double>::infinity());
    }

    // `Name`, `Name.Sub` (object references) or `Name.Sub { ... }` (a typed table).
    ScriptVal NameValue() {
        std::string path(cur_.name);
        Next();
        while (IsSymbol('.')) {
            Next();
            if (cur_.kind != Token::Name || IsKeyword(cur_.name)) Fail(cur_.pos, "expected a name after '.'");
            path += '.';
            path += cur_.name;
            Next();
        }
        if (IsSymbol('{')) return TableValue(std::move(path));
        if (IsSymbol('(') || cur_.kind == Token::String) Fail(cur_.pos, "function calls are not allowed");
        return Make::Ref(std::move(path));
    }

    ScriptVal Key() {
        const size_t at = cur_.pos;
        if (IsSymbol('{') || (cur_.kind == Token::Name && !IsKeyword(cur_.name)))
            Fail(at, "table key must be a number, text or boolean");
        ScriptVal key = Value();
        if (key.IsNil()) Fail(at, "table key cannot be nil");
        if (key.IsNumber() && std::isnan(key.AsNumber())) Fail(at, "table key cannot be NaN");
        return key;
    }

    ScriptVal TableValue(std::string className) {
        const size_t open = cur_.pos;
        if (++depth_ > kMaxDepth) Fail(open, "nesting too deep");
        Next();
        TableBuilder<Make> fields;
        if (notes_)
            fields.onRepeat = [this](const ScriptVal &first, const ScriptVal &again) {
                notes_->emplace_back(again.Line(), again.Column(),
                                     KeyText(again) + " is given twice (first at line " + std::to_string(first.Line()) +
                                         ")");
            };
        while (!IsSymbol('}')) {
            // Comments before the entry; one after the '{' on its line counts as one before the first entry.
            std::vector<std::string> comments;
            if (!cur_.trailing.empty()) comments.push_back(std::move(cur_.trailing));
            for (std::string &c : cur_.comments) comments.push_back(std::move(c));
            cur_.comments.clear();
            cur_.trailing.clear();
            const size_t before = fields.entries.size();
            if (IsSymbol('[')) {
                Next();
                ScriptVal key = Key();
                if (!IsSymbol(']')) Fail(cur_.pos, "expected ']' after table key");
                Next();
                if (!IsSymbol('=')) Fail(cur_.pos, "expected '=' after table key");
                Next();
                fields.Keyed(std::move(key), Value());
            } else if (cur_.kind == Token::Name && !IsKeyword(cur_.name) && Peek().kind == Token::Symbol &&
                       Peek().symbol == '=') {
                ScriptVal key = Placed(ScriptVal(std::string(cur_.name)), cur_.pos);
                Next();
                Next();
                fields.Keyed(std::move(key), Value());
            } else {
                fields.Positional(Value());
            }
            ScriptVal *entry = fields.entries.size() > before ? &fields.entries.back().second : nullptr;
            if (entry && !comments.empty()) entry->SetComments(std::move(comments));
            const bool separated = IsSymbol(',') || IsSymbol(';');
            if (separated) Next();
            // A comment after the value (and its comma) on the same line.
            if (entry && !cur_.trailing.empty()) entry->SetTrailingComment(std::move(cur_.trailing));
            cur_.trailing.clear();
            if (separated) continue;
            if (IsSymbol('}')) break;
            if (cur_.kind == Token::Symbol && cur_.symbol != '{' && cur_.symbol != '[')
                Fail(cur_.pos, "unexpected " + Describe(cur_));
            Fail(cur_.pos, "expected '}' to close table opened at line " + std::to_string(Position(open).first));
        }
        Next();
        --depth_;
        const size_t prefix = fields.Finish();
        return Make::Table(std::move(className), std::move(fields.entries), prefix);
    }
};

} // namespace
} // namespace scriptval_impl

ScriptParseError::ScriptParseError(int line, int column, const std::string &message)
    : std::runtime_error("line " + std::to_string(line) + ", column " + std::to_string(column) + ": " + message),
      line_(line), column_(column), message_(message) {}

// ---- values ----

ScriptVal::ScriptVal(bool b) : type_(Type::Bool), bool_(b) {}
ScriptVal::ScriptVal(double n) : type_(Type::Number), number_(n) {}
ScriptVal::ScriptVal(const char *text) {
    if (text) {
        type_ = Type::Text;
        text_ = text;
    }
}
ScriptVal::ScriptVal(std::string text) : type_(Type::Text), text_(std::move(text)) {}

ScriptVal ScriptVal::Table(std::string className) {
    if (!className.empty()) scriptval_impl::CheckPath(className, "class name");
    ScriptVal v;
    v.type_ = Type::Table;
    v.text_ = std::move(className);
    v.table_ = std::make_shared<std::vector<Entry>>();
    return v;
}

ScriptVal ScriptVal::Ref(std::string path) {
    scriptval_impl::CheckPath(path, "object reference");
    ScriptVal v;
    v.type_ = Type::ObjectRef;
    v.text_ = std::move(path);
    return v;
}

const std::vector<std::string> &ScriptVal::Comments() const {
    static const std::vector<std::string> none;
    return notes_ ? notes_->before : none;
}

const std::string &ScriptVal::TrailingComment() const {
    static const std::string none;
    return notes_ ? notes_->after : none;
}

void ScriptVal::SetComments(std::vector<std::string> comments) {
    Notes notes = notes_ ? *notes_ : Notes{};
    notes.before = std::move(comments);
    notes_ = notes.before.empty() && notes.after.empty() ? nullptr : std::make_shared<const Notes>(std::move(notes));
}

void ScriptVal::SetTrailingComment(std::string comment) {
    Notes notes = notes_ ? *notes_ : Notes{};
    notes.after = std::move(comment);
    notes_ = notes.before.empty() && notes.after.empty() ? nullptr : std::make_shared<const Notes>(std::move(notes));
}

const std::vector<ScriptVal::Entry> &ScriptVal::Entries() const {
    static const std::vector<Entry> empty;
    return table_ ? *table_ : empty;
}

size_t ScriptVal::ArrayLength() const {
    if (!table_) return 0;
    const auto &entries = *table_;
    const size_t known = std::min(arrayPrefix_, entries.size());
    if (known == entries.size()) return known;
    // Keys 1..known are the leading entries; look for known+1, known+2, ... among the rest.
    std::vector<bool> present(entries.size() - known, false);
    for (size_t i = known; i < entries.size(); ++i) {
        const ScriptVal &k = entries[i].first;
        if (!k.IsNumber()) continue;
        const double d = k.AsNumber();
        if (d > static_cast<double>(known) && d <= static_cast<double>(entries.size()) && d == std::trunc(d))
            present[static_cast<size_t>(d) - known - 1] = true;
    }
    size_t n = known;
    while (n - known < present.size() && present[n - known]) ++n;
    return n;
}

const ScriptVal *ScriptVal::Find(const ScriptVal &key) const {
    if (!table_) return nullptr;
    for (const auto &e : *table_)
        if (e.first == key) return &e.second;
    return nullptr;
}

const ScriptVal *ScriptVal::Find(std::string_view key) const {
    if (!table_) return nullptr;
    for (const auto &e : *table_)
        if (e.first.IsText() && e.first.AsText() == key) return &e.second;
    return nullptr;
}

const ScriptVal *ScriptVal::At(size_t oneBasedIndex) const {
    if (!table_ || oneBasedIndex == 0) return nullptr;
    if (oneBasedIndex <= std::min(arrayPrefix_, table_->size())) return &(*table_)[oneBasedIndex - 1].second;
    for (const auto &e : *table_)
        if (scriptval_impl::IsNumberKey(e.first, oneBasedIndex)) return &e.second;
    return nullptr;
}

void ScriptVal::Detach() {
    if (!table_) {
        table_ = std::make_shared<std::vector<Entry>>();
        arrayPrefix_ = 0;
    } else if (table_.use_count() != 1) {
        table_ = std::make_shared<std::vector<Entry>>(*table_);
    }
}

ScriptVal &ScriptVal::Set(const ScriptVal &key, ScriptVal value) {
    if (type_ == Type::Nil) *this = Table();
    if (type_ != Type::Table) throw std::logic_error("ScriptVal::Set: value is not a table");
    if (!scriptval_impl::ValidKey(key))
        throw std::invalid_argument("ScriptVal::Set: a key must be a boolean, a number (not NaN) or a text");
    const auto &entries = Entries();
    size_t i = 0;
    const size_t known = std::min(arrayPrefix_, entries.size());
    if (key.IsNumber() && key.AsNumber() >= 1 && key.AsNumber() <= static_cast<double>(known) &&
        key.AsNumber() == std::trunc(key.AsNumber()))
        i = static_cast<size_t>(key.AsNumber()) - 1;
    else
        while (i < entries.size() && !(entries[i].first == key)) ++i;
    if (i < entries.size()) {
        if (value.IsNil()) {
            Remove(key);
        } else {
            Detach();
            (*table_)[i].second = std::move(value);
        }
        return *this;
    }
    if (value.IsNil()) return *this;
    Entry entry(key, std::move(value)); // key may refer into this table: copy before the vector grows
    Detach();
    const bool extendsArray =
        arrayPrefix_ == table_->size() && scriptval_impl::IsNumberKey(entry.first, arrayPrefix_ + 1);
    table_->push_back(std::move(entry));
    if (extendsArray) ++arrayPrefix_;
    return *this;
}

ScriptVal &ScriptVal::Set(std::string_view key, ScriptVal value) {
    if (type_ == Type::Table && table_) {
        auto &entries = *table_;
        for (size_t i = 0; i < entries.size(); ++i) {
            if (entries[i].first.IsText() && entries[i].first.AsText() == key) {
                if (value.IsNil()) {
                    Remove(entries[i].first);
                    return *this;
                }
                Detach();
                (*table_)[i].second = std::move(value);
                return *this;
            }
        }
    }
    return Set(ScriptVal(std::string(key)), std::move(value));
}

ScriptVal &ScriptVal::Append(ScriptVal value) {
    if (type_ == Type::Nil) *this = Table();
    if (type_ != Type::Table) throw std::logic_error("ScriptVal::Append: value is not a table");
    if (value.IsNil()) return *this;
    const size_t n = ArrayLength(); // key n+1 is absent by definition
    Detach();
    const bool extendsArray = arrayPrefix_ == table_->size();
    table_->emplace_back(ScriptVal(static_cast<double>(n + 1)), std::move(value));
    if (extendsArray) ++arrayPrefix_;
    return *this;
}

bool ScriptVal::Remove(const ScriptVal &key) {
    if (!table_) return false;
    const auto &entries = *table_;
    size_t i = 0;
    while (i < entries.size() && !(entries[i].first == key)) ++i;
    if (i == entries.size()) return false;
    Detach();
    auto &mine = *table_;
    mine.erase(mine.begin() + static_cast<std::ptrdiff_t>(i));
    if (i < arrayPrefix_) arrayPrefix_ = i;
    while (arrayPrefix_ < mine.size() && scriptval_impl::IsNumberKey(mine[arrayPrefix_].first, arrayPrefix_ + 1))
        ++arrayPrefix_;
    return true;
}

bool operator==(const ScriptVal &a, const ScriptVal &b) {
    if (a.type_ != b.type_) return false;
    switch (a.type_) {
    case ScriptVal::Type::Nil: return true;
    case ScriptVal::Type::Bool: return a.bool_ == b.bool_;
    case ScriptVal::Type::Number: return a.number_ == b.number_ || (std::isnan(a.number_) && std::isnan(b.number_));
    case ScriptVal::Type::Text:
    case ScriptVal::Type::ObjectRef: return a.text_ == b.text_;
    case ScriptVal::Type::Table: return a.text_ == b.text_ && (a.table_ == b.table_ || a.Entries() == b.Entries());
    }
    return false;
}

std::string ScriptVal::ToText(int indent) const {
    std::string out;
    scriptval_impl::WriteComments(out, *this, std::max(indent, 0));
    scriptval_impl::WriteValue(out, *this, std::max(indent, 0));
    return out;
}

// ---- parsing ----

class ScriptVal::Builder {
public:
    static ScriptVal Ref(std::string path) {
        ScriptVal v;
        v.type_ = Type::ObjectRef;
        v.text_ = std::move(path);
        return v;
    }
    static ScriptVal Table(std::string className, std::vector<Entry> entries, size_t arrayPrefix) {
        ScriptVal v;
        v.type_ = Type::Table;
        v.text_ = std::move(className);
        v.arrayPrefix_ = arrayPrefix;
        v.table_ = std::make_shared<std::vector<Entry>>(std::move(entries));
        return v;
    }
    static void Place(ScriptVal &v, int line, int column) {
        v.line_ = line;
        v.column_ = column;
    }
};

ScriptVal ScriptVal::TableOf(std::string className, std::vector<Entry> entries) {
    if (!className.empty()) scriptval_impl::CheckPath(className, "class name");
    std::unordered_set<std::string> keys;
    keys.reserve(entries.size());
    for (const Entry &e : entries) {
        if (!scriptval_impl::ValidKey(e.first) || e.second.IsNil())
            throw std::invalid_argument("ScriptVal::TableOf: invalid key or nil value");
        if (!keys.insert(scriptval_impl::IndexKey(e.first)).second)
            throw std::invalid_argument("ScriptVal::TableOf: key " + e.first.ToText() + " given twice");
    }
    const size_t prefix = scriptval_impl::LeadingArray(entries);
    return Builder::Table(std::move(className), std::move(entries), prefix);
}

ScriptVal ScriptVal::FromText(std::string_view text) { return FromText(text, nullptr); }

ScriptVal ScriptVal::FromText(std::string_view text, std::vector<ScriptParseError> *notes) {
    // A UTF-8 byte order mark, as some editors write, is not part of the document.
    if (text.substr(0, 3) == "\xEF\xBB\xBF") text.remove_prefix(3);
    return scriptval_impl::Reader<Builder>(text, notes).Document();
}

} // namespace Orvane
