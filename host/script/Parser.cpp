#include "host/script/Parser.h"

#include <fmt/format.h>

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cmath>
#include <numbers>
#include <unordered_map>
#include <vector>

#include "host/core/Suggest.h"

namespace Orvane {
// Named as well as anonymous: the host is compiled in unity batches, where another file's helpers share this unit.
namespace expression_parser {
namespace {

constexpr unsigned InPixel = 1u << static_cast<int>(ExpressionContext::Pixel);
constexpr unsigned InSetup = 1u << static_cast<int>(ExpressionContext::Setup);
constexpr unsigned InNumber = 1u << static_cast<int>(ExpressionContext::Number);
constexpr unsigned InCustom = InPixel | InSetup;
constexpr unsigned Everywhere = InCustom | InNumber;

// A name of the language. A value is written as its Lua text; a function as
// `lua` (the call up to its first argument), the arguments and ")".
struct NameInfo {
    bool function = false;
    std::string lua;
    unsigned arities = 0; // bit n: n arguments are accepted
    uint64_t flags = 0;
    unsigned contexts = 0;
};

constexpr unsigned Arity(int n) { return 1u << n; }
constexpr unsigned AritiesFrom(int n) { return ~0u << n; }

// Name in the language, field of the pixel in Lua, and the key of the host's sampler for that channel.
struct ChannelName {
    const char *name, *field, *samplerKey;
};
// clang-format off
constexpr ChannelName channelNames[] = {
    {"r", "R", "r"}, {"g", "G", "g"}, {"b", "B", "b"}, {"a", "A", "a"},
    {"bgr", "BgR", "bgr"}, {"bgg", "BgG", "bgg"}, {"bgb", "BgB", "bgb"}, {"bga", "BgA", "bga"},
    {"z", "Z", "z"}, {"cv", "Coverage", "cov"}, {"u", "U", "u"}, {"v", "V", "v"},
    {"nx", "NX", "nx"}, {"ny", "NY", "ny"}, {"nz", "NZ", "nz"}, {"vx", "VectX", "vx"},
    {"vy", "VectY", "vy"}, {"bx", "BackVectX", "bx"}, {"by", "BackVectY", "by"}, {"px", "PositionX", "px"},
    {"py", "PositionY", "py"}, {"pz", "PositionZ", "pz"}, {"dx", "DisparityX", "dx"}, {"dy", "DisparityY", "dy"},
};
// clang-format on
static_assert(std::size(channelNames) == static_cast<size_t>(ExpressionChannel::Count));

// Edge handling of a sampler: black, wrap, duplicate, mirror.
constexpr char edgeLetters[] = "bwdm";

// One-argument maths functions; each is bound by the prelude as "_" and its name.
constexpr const char *unaryMaths[] = {"sin",  "cos", "tan", "asin",  "acos", "atan",  "sinh", "cosh",  "tanh",
                                      "sqrt", "exp", "log", "log10", "abs",  "floor", "ceil", "round", "sign"};

using NameTable = std::unordered_map<std::string, NameInfo>;

void AddValue(NameTable &names, std::string name, std::string lua, uint64_t flags, unsigned contexts) {
    names[std::move(name)] = NameInfo{false, std::move(lua), 0, flags, contexts};
}
void AddFunction(NameTable &names, std::string name, std::string lua, unsigned arities, uint64_t flags,
                 unsigned contexts) {
    names[std::move(name)] = NameInfo{true, std::move(lua), arities, flags, contexts};
}

std::string FormatNumber(double v) {
    char text[32];
    return std::string(text, std::to_chars(text, text + sizeof text, v).ptr);
}

NameTable MakeNames() {
    using namespace ExpressionFlags;
    NameTable names;
    for (const char *f : unaryMaths) AddFunction(names, f, fmt::format("_{}(", f), Arity(1), 0, Everywhere);
    for (const char *f : {"atan2", "pow", "fmod"})
        AddFunction(names, f, fmt::format("_{}(", f), Arity(2), 0, Everywhere);
    for (const char *f : {"min", "max"}) AddFunction(names, f, fmt::format("_{}(", f), AritiesFrom(2), 0, Everywhere);
    for (const char *f : {"clamp", "lerp", "smoothstep"})
        AddFunction(names, f, fmt::format("_{}(", f), Arity(3), 0, Everywhere);
    AddFunction(names, "rand", "_rand(", Arity(0) | Arity(2), Random, Everywhere);
    AddValue(names, "pi", FormatNumber(std::numbers::pi), 0, Everywhere);
    AddValue(names, "e", FormatNumber(std::numbers::e), 0, Everywhere);
    AddValue(names, "time", "time", Time, Everywhere);

    // Inputs: the Custom tool has eight numbers and four points with z; the Expression modifier nine of each, without
    // z.
    for (int k = 1; k <= 9; ++k) {
        const unsigned contexts = (k <= 8 ? InCustom : 0) | InNumber;
        AddValue(names, fmt::format("n{}", k), fmt::format("n{}", k), Numbers, contexts);
        AddFunction(names, fmt::format("n{}_at", k), fmt::format("_numat({}, ", k), Arity(1), TimedInputs, InNumber);
        for (const char *axis : {"x", "y", "z"}) {
            const unsigned pointContexts = (k <= 4 ? InCustom : 0) | (*axis != 'z' ? InNumber : 0);
            AddValue(names, fmt::format("p{}{}", k, axis), fmt::format("p{}{}", k, axis), Points, pointContexts);
            if (*axis != 'z')
                AddFunction(names, fmt::format("p{}{}_at", k, axis), fmt::format("_pt{}at({}, ", axis, k), Arity(1),
                            TimedInputs, InNumber);
        }
    }
    for (int k = 1; k <= 4; ++k)
        AddFunction(names, fmt::format("lut{}", k), fmt::format("_lut({}, ", k), Arity(1), Luts, InCustom);
    for (int k = 1; k <= 8; ++k) {
        AddValue(names, fmt::format("s{}", k), fmt::format("s{}", k), SetupValue(k), InCustom);
        AddValue(names, fmt::format("i{}", k), fmt::format("i{}", k), IntermediateValue(k), InPixel);
    }

    // The pixel being written and the images.
    AddValue(names, "x", "xpos", Position, InPixel);
    AddValue(names, "y", "ypos", Position, InPixel);
    for (const char *size : {"w", "h", "ax", "ay"})
        AddValue(names, size, fmt::format("_{}", size), OutputSize, InCustom);
    for (int k = 1; k <= 3; ++k) {
        const uint64_t image = Image1 << (k - 1);
        for (const char *size : {"w", "h", "ax", "ay"})
            AddValue(names, fmt::format("{}{}", size, k), fmt::format("_{}{}", size, k), image, InCustom);
        AddValue(names, fmt::format("c{}", k), fmt::format("c{}", k), image | Current, InPixel);
        for (size_t c = 0; c < std::size(channelNames); ++c) {
            const ChannelName &ch = channelNames[c];
            const uint64_t channel = Channel(static_cast<ExpressionChannel>(c));
            AddValue(names, fmt::format("{}{}", ch.name, k), fmt::format("p{}.{}", k, ch.field), image | channel,
                     InPixel);
            for (const char *edge = edgeLetters; *edge; ++edge)
                AddFunction(names, fmt::format("get{}{}{}", ch.name, k, *edge),
                            fmt::format("get{}{}fn(img{}, ", ch.samplerKey, *edge, k), Arity(2),
                            image | (Sampler1 << (k - 1)) | channel, InCustom);
        }
    }
    return names;
}

const NameTable &Names() {
    static const NameTable names = MakeNames();
    return names;
}

const char *ContextWords(ExpressionContext context) {
    switch (context) {
    case ExpressionContext::Pixel: return "pixel expressions";
    case ExpressionContext::Setup: return "setup expressions";
    case ExpressionContext::Number: return "number expressions";
    }
    return "";
}

// Deep enough for any hand-written expression, shallow enough for LuaJIT's
// parser, which refuses Lua text nested past 200 levels.
constexpr int maxDepth = 40;

struct Node {
    enum Kind { Number, Name, If, Unary, Binary } kind = Number;
    int position = 0;
    double number = 0;
    const NameInfo *name = nullptr;
    std::string op;
    std::vector<Node> args;
    int depth = 1; // levels of the tree from here down
};

// Thrown inside the parser only; Parse turns it into a ParseError.
struct Failure {
    int position;
    std::string message;
};

// Binary operators by precedence, lowest first. The words and, or, not are read as &&, ||, !.
const std::vector<std::vector<std::string_view>> binaryLevels = {
    {"||"}, {"&&"}, {"==", "!="}, {"<", "<=", ">", ">="}, {"+", "-"}, {"*", "/", "%"},
};
constexpr size_t sumLevel = 4; // + and -, followed by * / %

size_t LevelOf(std::string_view op) {
    for (size_t level = 0; level < binaryLevels.size(); ++level)
        if (std::find(binaryLevels[level].begin(), binaryLevels[level].end(), op) != binaryLevels[level].end())
            return level;
    return binaryLevels.size(); // ^
}

// A left operand at the same level of + and - or of * / %, which Lua groups from the left as well.
bool IsFlatRun(const Node &node) {
    const size_t level = LevelOf(node.op);
    return node.kind == Node::Binary && level >= sumLevel && level < binaryLevels.size() &&
           node.args[0].kind == Node::Binary && LevelOf(node.args[0].op) == level;
}

// Longer texts are refused: the tree is at most this many nodes, however it leans.
constexpr size_t maxLength = 20000;

class ExpressionReader {
public:
    ExpressionReader(std::string_view text, ExpressionContext context, const NameAliases *aliases)
        : text_(text), context_(context), aliases_(aliases) {}

    Node ReadAll() {
        if (text_.size() > maxLength) Fail(1, fmt::format("expression longer than {} characters", maxLength));
        Next();
        Node root = ReadBinary(0);
        if (token_ != Token::End) Fail(tokenPos_, fmt::format("unexpected '{}'", tokenText_));
        return root;
    }
    uint64_t Flags() const { return flags_; }

private:
    enum class Token { End, Number, Name, Op };

    [[noreturn]] static void Fail(int position, std::string message) { throw Failure{position, std::move(message)}; }

    // ASCII only, whatever the locale.
    static bool IsDigit(char c) { return c >= '0' && c <= '9'; }
    static bool IsNameStart(char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_'; }
    static bool IsNameChar(char c) { return IsNameStart(c) || IsDigit(c); }

    void Next() {
        while (at_ < text_.size() &&
               (text_[at_] == ' ' || text_[at_] == '\t' || text_[at_] == '\r' || text_[at_] == '\n'))
            ++at_;
        tokenPos_ = static_cast<int>(at_) + 1;
        if (at_ >= text_.size()) {
            token_ = Token::End;
            tokenText_ = "end of expression";
            return;
        }
        const size_t start = at_;
        const char c = text_[at_];
        if (IsDigit(c) || (c == '.' && at_ + 1 < text_.size() && IsDigit(text_[at_ + 1]))) {
            ReadNumber();
        } else if (IsNameStart(c)) {
            while (at_ < text_.size() && IsNameChar(text_[at_])) ++at_;
            token_ = Token::Name;
            tokenText_ = text_.substr(start, at_ - start);
            static const std::unordered_map<std::string_view, std::string_view> words = {
                {"and", "&&"}, {"or", "||"}, {"not", "!"}};
            if (auto word = words.find(tokenText_); word != words.end()) {
                token_ = Token::Op;
                tokenText_ = word->second;
            }
        } else {
            ReadOperator();
        }
    }

    void ReadNumber() {
        const size_t start = at_;
        while (at_ < text_.size() && IsDigit(text_[at_])) ++at_;
        if (at_ < text_.size() && text_[at_] == '.')
            for (++at_; at_ < text_.size() && IsDigit(text_[at_]);) ++at_;
        if (at_ < text_.size() && (text_[at_] == 'e' || text_[at_] == 'E')) {
            size_t exponent = at_ + 1;
            if (exponent < text_.size() && (text_[exponent] == '+' || text_[exponent] == '-')) ++exponent;
            if (exponent >= text_.size() || !IsDigit(text_[exponent])) Fail(tokenPos_, "malformed number");
            for (at_ = exponent; at_ < text_.size() && IsDigit(text_[at_]);) ++at_;
        }
        if (at_ < text_.size() && (IsNameChar(text_[at_]) || text_[at_] == '.')) Fail(tokenPos_, "malformed number");
        const auto [end, status] = std::from_chars(text_.data() + start, text_.data() + at_, number_);
        if (status != std::errc() || !std::isfinite(number_)) Fail(tokenPos_, "number out of range");
        token_ = Token::Number;
        tokenText_ = text_.substr(start, at_ - start);
    }

    void ReadOperator() {
        static constexpr std::string_view operators[] = {"==", "!=", "<=", ">=", "&&", "||", "+", "-", "*",
                                                         "/",  "%",  "^",  "<",  ">",  "!",  "(", ")", ","};
        const std::string_view rest = text_.substr(at_);
        for (std::string_view op : operators)
            if (rest.starts_with(op)) {
                at_ += op.size();
                token_ = Token::Op;
                tokenText_ = op;
                return;
            }
        const unsigned char c = rest[0];
        if (c == '=') Fail(tokenPos_, "'=' does not compare: use '=='");
        if (c == '&' || c == '|') Fail(tokenPos_, fmt::format("use '{0}{0}' for logic", static_cast<char>(c)));
        if (c < 0x20 || c >= 0x7f) Fail(tokenPos_, fmt::format("unexpected character (byte 0x{:02x})", c));
        Fail(tokenPos_, fmt::format("unexpected character '{}'", static_cast<char>(c)));
    }

    bool AtOp(std::string_view op) const { return token_ == Token::Op && tokenText_ == op; }
    void Expect(std::string_view op) {
        if (!AtOp(op)) Fail(tokenPos_, fmt::format("expected '{}' before '{}'", op, tokenText_));
        Next();
    }

    Node ReadBinary(size_t level) {
        if (level == binaryLevels.size()) return ReadUnary();
        Node left = ReadBinary(level + 1);
        for (;;) {
            const std::vector<std::string_view> &ops = binaryLevels[level];
            if (token_ != Token::Op || std::find(ops.begin(), ops.end(), tokenText_) == ops.end()) return left;
            Node node{Node::Binary, tokenPos_, 0, nullptr, std::string(tokenText_), {}};
            Next();
            node.args.push_back(std::move(left));
            node.args.push_back(ReadBinary(level + 1));
            left = Checked(std::move(node));
        }
    }

    // Unary operators bind tighter than * and looser than ^: -2^2 is -4, 2^-1 is 0.5.
    Node ReadUnary() {
        if (++depth_ > maxDepth) Fail(tokenPos_, "expression nested too deeply");
        Node result;
        if (AtOp("-") || AtOp("+") || AtOp("!")) {
            result = Node{Node::Unary, tokenPos_, 0, nullptr, std::string(tokenText_), {}};
            Next();
            result.args.push_back(ReadUnary());
            result = Checked(std::move(result));
        } else {
            result = ReadPower();
        }
        --depth_;
        return result;
    }

    // ^ groups from the right: 2^3^2 is 2^9.
    Node ReadPower() {
        Node base = ReadPrimary();
        if (!AtOp("^")) return base;
        Node node{Node::Binary, tokenPos_, 0, nullptr, "^", {}};
        Next();
        node.args.push_back(std::move(base));
        node.args.push_back(ReadUnary());
        return Checked(std::move(node));
    }

    Node ReadPrimary() {
        const int position = tokenPos_;
        if (token_ == Token::Number) {
            Node node{Node::Number, position, number_, nullptr, {}, {}};
            Next();
            return node;
        }
        if (AtOp("(")) {
            Next();
            Node inner = ReadBinary(0);
            Expect(")");
            return inner;
        }
        if (token_ != Token::Name) Fail(position, fmt::format("expected a value before '{}'", tokenText_));
        // The name is looked up before the next token is read, so that "os.exit" reports "os" rather than the dot.
        const std::string name(tokenText_);
        if (name == "if") {
            Next();
            Node node{Node::If, position, 0, nullptr, {}, ReadArguments(name)};
            if (node.args.size() != 3) Fail(position, "if() takes 3 arguments: if(condition, then, else)");
            return Checked(std::move(node));
        }
        const NameInfo &info = Lookup(name, position);
        Next();
        if (!info.function) {
            if (AtOp("(")) Fail(position, fmt::format("'{}' is not a function", name));
            flags_ |= info.flags;
            return Node{Node::Name, position, 0, &info, {}, {}};
        }
        if (!AtOp("(")) Fail(position, fmt::format("'{}' is a function: write {}(...)", name, name));
        Node node{Node::Name, position, 0, &info, {}, ReadArguments(name)};
        if (node.args.size() >= 32 || !(info.arities & (1u << node.args.size())))
            Fail(position, fmt::format("{}() cannot take {} argument{}", name, node.args.size(),
                                       node.args.size() == 1 ? "" : "s"));
        flags_ |= info.flags;
        return Checked(std::move(node));
    }

    std::vector<Node> ReadArguments(const std::string &name) {
        if (!AtOp("(")) Fail(tokenPos_, fmt::format("expected '(' after {}", name));
        Next();
        std::vector<Node> args;
        if (AtOp(")")) {
            Next();
            return args;
        }
        for (;;) {
            args.push_back(ReadBinary(0));
            if (AtOp(")")) break;
            Expect(",");
        }
        Next();
        return args;
    }

    const NameInfo &Lookup(const std::string &name, int position) const {
        const NameTable &names = Names();
        const unsigned here = 1u << static_cast<int>(context_);
        if (auto found = names.find(name); found != names.end()) {
            if (found->second.contexts & here) return found->second;
            Fail(position, fmt::format("'{}' is not available in {}", name, ContextWords(context_)));
        }
        if (aliases_)
            if (auto alias = aliases_->find(name); alias != aliases_->end()) {
                auto found = names.find(alias->second);
                if (found != names.end() && (found->second.contexts & here)) return found->second;
                Fail(position, fmt::format("'{}' stands for '{}', which is not available in {}", name, alias->second,
                                           ContextWords(context_)));
            }
        std::vector<std::string> known;
        for (const auto &[candidate, info] : names)
            if (info.contexts & here) known.push_back(candidate);
        std::sort(known.begin(), known.end()); // the same suggestion whatever the table's order
        Fail(position, fmt::format("unknown name '{}'{}", name, DidYouMean(name, known)));
    }

    // Bounds the depth of the tree, so that the Lua text stays within LuaJIT's nesting limit. A run of + and -
    // (or of * / %) is written flat (see LuaArithmetic), so it adds no depth of its own.
    Node Checked(Node node) {
        int depth = 0;
        for (const Node &arg : node.args) depth = std::max(depth, arg.depth + 1);
        if (IsFlatRun(node)) depth = std::max(node.args[0].depth, node.args[1].depth + 1);
        if (depth > maxDepth) Fail(node.position, "expression nested too deeply");
        node.depth = depth;
        return node;
    }

    std::string_view text_;
    ExpressionContext context_;
    const NameAliases *aliases_;
    size_t at_ = 0;
    Token token_ = Token::End;
    std::string_view tokenText_;
    int tokenPos_ = 1;
    double number_ = 0;
    int depth_ = 0;
    uint64_t flags_ = 0;
};

// Lua text of a node as a number, and as a Lua boolean (conditions of if and the logic operators).
std::string LuaNumber(const Node &node);

bool IsComparison(const std::string &op) {
    return op == "==" || op == "!=" || op == "<" || op == "<=" || op == ">" || op == ">=";
}
bool IsBoolean(const Node &node) {
    return (node.kind == Node::Binary && (IsComparison(node.op) || node.op == "&&" || node.op == "||")) ||
           (node.kind == Node::Unary && node.op == "!");
}

// Runs such as a + b - c + d are written without inner parentheses, so that a sum of many samples does not nest.
std::string LuaArithmetic(const Node &node) {
    std::vector<const Node *> run{&node};
    while (IsFlatRun(*run.back())) run.push_back(&run.back()->args[0]);
    std::string text = "(" + LuaNumber(run.back()->args[0]);
    for (auto step = run.rbegin(); step != run.rend(); ++step)
        text += " " + (*step)->op + " " + LuaNumber((*step)->args[1]);
    return text + ")";
}

std::string LuaCondition(const Node &node) {
    if (!IsBoolean(node)) return "(" + LuaNumber(node) + " ~= 0)";
    if (node.kind == Node::Unary) return "(not " + LuaCondition(node.args[0]) + ")";
    if (node.op == "&&" || node.op == "||")
        return "(" + LuaCondition(node.args[0]) + (node.op == "&&" ? " and " : " or ") + LuaCondition(node.args[1]) +
               ")";
    const std::string op = node.op == "!=" ? "~=" : node.op;
    return "(" + LuaNumber(node.args[0]) + " " + op + " " + LuaNumber(node.args[1]) + ")";
}

std::string LuaNumber(const Node &node) {
    switch (node.kind) {
    case Node::Number: return FormatNumber(node.number);
    case Node::If:
        // `c and a or b` picks a whenever c holds, since a number is never false in Lua.
        return "(" + LuaCondition(node.args[0]) + " and " + LuaNumber(node.args[1]) + " or " + LuaNumber(node.args[2]) +
               ")";
    case Node::Name: {
        if (!node.name->function) return node.name->lua;
        std::string call = node.name->lua;
        for (size_t i = 0; i < node.args.size(); ++i) call += (i ? ", " : "") + LuaNumber(node.args[i]);
        return call + ")";
    }
    case Node::Unary:
        if (node.op == "-") return "(-" + LuaNumber(node.args[0]) + ")";
        if (node.op == "+") return LuaNumber(node.args[0]);
        break;
    case Node::Binary:
        if (!IsBoolean(node)) return LuaArithmetic(node);
        break;
    }
    return "(" + LuaCondition(node) + " and 1 or 0)";
}

} // namespace
} // namespace expression_parser

using namespace expression_parser;

std::string ParseError::Describe() const { return fmt::format("column {}: {}", position, message); }

bool Parser::Parse(std::string_view text, ExpressionContext context, std::string *luaText, ParseError *error,
                   const NameAliases *aliases) {
    try {
        ExpressionReader reader(text, context, aliases);
        const Node root = reader.ReadAll();
        *luaText = LuaNumber(root);
        flags_ |= reader.Flags();
        return true;
    } catch (const Failure &failure) {
        if (error) *error = ParseError{failure.position, failure.message};
        return false;
    }
}

const std::string &Parser::LuaPrelude() {
    static const std::string prelude = [] {
        std::string names, values;
        for (const char *f : unaryMaths)
            if (std::string_view(f) != "round" && std::string_view(f) != "sign") {
                names += fmt::format("{}_{}", names.empty() ? "" : ", ", f);
                values += fmt::format("{}math.{}", values.empty() ? "" : ", ", f);
            }
        for (const char *f : {"atan2", "pow", "fmod", "min", "max", "random"}) {
            names += fmt::format(", _{}", f);
            values += fmt::format(", math.{}", f);
        }
        return "local " + names + " = " + values +
               "\n"
               "local function _round(v) return _floor(v + 0.5) end\n"
               "local function _sign(v) return v > 0 and 1 or (v < 0 and -1 or 0) end\n"
               "local function _clamp(v, lo, hi) return _min(_max(v, lo), hi) end\n"
               "local function _lerp(a, b, t) return a + (b - a) * t end\n"
               "local function _smoothstep(e0, e1, v)\n"
               "  local t = _clamp((v - e0) / (e1 - e0), 0, 1)\n"
               "  return t * t * (3 - 2 * t)\n"
               "end\n"
               "local function _rand(a, b) if a then return a + (b - a) * _random() end return _random() end\n";
    }();
    return prelude;
}

namespace {
bool IsWord(const std::string &s) {
    if (s.empty() || !std::isalpha(static_cast<unsigned char>(s[0]))) return false;
    return std::all_of(s.begin(), s.end(),
                       [](char c) { return std::isalnum(static_cast<unsigned char>(c)) || c == '_'; });
}
} // namespace

NameAliases InputNameAliases(const std::vector<std::string> &numberNames, const std::vector<std::string> &pointNames,
                             bool timedForms, bool withZ) {
    NameAliases aliases;
    for (size_t k = 1; k <= numberNames.size(); ++k) {
        const std::string &name = numberNames[k - 1];
        if (!IsWord(name)) continue;
        aliases[name] = fmt::format("n{}", k);
        if (timedForms) aliases[name + "_at"] = fmt::format("n{}_at", k);
    }
    for (size_t k = 1; k <= pointNames.size(); ++k) {
        const std::string &name = pointNames[k - 1];
        if (!IsWord(name)) continue;
        for (const char *axis : {"x", "y", "z"}) {
            if (*axis == 'z' && !withZ) continue;
            aliases[name + axis] = fmt::format("p{}{}", k, axis);
            if (timedForms && *axis != 'z') aliases[name + axis + "_at"] = fmt::format("p{}{}_at", k, axis);
        }
    }
    return aliases;
}

} // namespace Orvane
