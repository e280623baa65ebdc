#pragma once
// ScriptVal: a serialisable script value, and the form of every flow document.
//
// A value is nil, a boolean, a number, a text, a table, or an object
// reference. A table keeps its keys in insertion order and may carry a class
// name, written `ClassName { ... }` (a typed table). An object reference names
// another object by a dotted path, as a link names `Tool.Output`.
//
// ToText writes Lua table syntax; FromText reads it back as data: nothing is
// ever executed. FromText(ToText(v)) == v for every value, numbers included
// (shortest round-trip form; inf and nan as 1/0, -1/0 and 0/0).
//
// Values read from text remember where they stood (line and column) and the
// comments written just before their table entry (or before the whole text),
// so documents can point at a problem and keep a writer's notes when saved.
// Equality ignores both.
//
// Thread safety: a ScriptVal is a value; const access from several threads is safe.
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

/// A syntax error in script text, with 1-based line and column.
class ORVANE_API ScriptParseError : public std::runtime_error {
public:
    ScriptParseError(int line, int column, const std::string &message);
    int Line() const { return line_; }
    int Column() const { return column_; }
    /// The bare message, without position.
    const std::string &Message() const { return message_; }

private:
    int line_, column_;
    std::string message_;
};

class ORVANE_API ScriptVal {
public:
    enum class Type { Nil, Bool, Number, Text, Table, ObjectRef };
    using Entry = std::pair<ScriptVal, ScriptVal>;

    ScriptVal() = default; ///< nil
    ScriptVal(bool b);
    ScriptVal(double n);
    ScriptVal(int n) : ScriptVal(static_cast<double>(n)) {}
    ScriptVal(long long n) : ScriptVal(static_cast<double>(n)) {}
    ScriptVal(const char *text);
    ScriptVal(std::string text);

    static ScriptVal Table(std::string className = {});
    static ScriptVal Ref(std::string path);

    Type GetType() const { return type_; }
    bool IsNil() const { return type_ == Type::Nil; }
    bool IsBool() const { return type_ == Type::Bool; }
    bool IsNumber() const { return type_ == Type::Number; }
    bool IsText() const { return type_ == Type::Text; }
    bool IsTable() const { return type_ == Type::Table; }
    bool IsRef() const { return type_ == Type::ObjectRef; }

    bool AsBool() const { return bool_; }
    double AsNumber() const { return number_; }
    /// Text of a Text value, or the path of an ObjectRef.
    const std::string &AsText() const { return text_; }

    // ---- tables ----
    /// Class name of a typed table ("" for a plain table).
    const std::string &ClassName() const { return text_; }
    void SetClassName(std::string name) { text_ = std::move(name); }
    const std::vector<Entry> &Entries() const;
    size_t Size() const { return Entries().size(); }
    /// Number of consecutive integer keys 1, 2, ... (the array part).
    size_t ArrayLength() const;
    const ScriptVal *Find(const ScriptVal &key) const;
    const ScriptVal *Find(std::string_view key) const;
    // Text keys given as C strings or std::string would otherwise be ambiguous between the two overloads above.
    const ScriptVal *Find(const char *key) const { return Find(std::string_view(key)); }
    const ScriptVal *Find(const std::string &key) const { return Find(std::string_view(key)); }
    const ScriptVal *At(size_t oneBasedIndex) const;
    /// Sets key to value, replacing an existing entry in place or appending.
    /// Setting nil removes the key.
    ScriptVal &Set(const ScriptVal &key, ScriptVal value);
    ScriptVal &Set(std::string_view key, ScriptVal value);
    ScriptVal &Set(const char *key, ScriptVal value) { return Set(std::string_view(key), std::move(value)); }
    ScriptVal &Set(const std::string &key, ScriptVal value) { return Set(std::string_view(key), std::move(value)); }
    /// Appends at the next array index.
    ScriptVal &Append(ScriptVal value);
    bool Remove(const ScriptVal &key);
    /// A table made from entries at once (linear, where Set one by one is
    /// quadratic). Throws std::invalid_argument for an invalid or repeated key.
    static ScriptVal TableOf(std::string className, std::vector<Entry> entries);

    // ---- where a value came from ----
    /// 1-based line and column of the value's first character in the text it
    /// was read from; 0 for values made in code.
    int Line() const { return line_; }
    int Column() const { return column_; }
    /// Comments written on the lines before this value's entry in its table,
    /// or before the whole text for the value FromText returns: each as
    /// written, from "--". ToText writes them back in the same places.
    const std::vector<std::string> &Comments() const;
    void SetComments(std::vector<std::string> comments);
    /// A comment written after the entry on its own line ("" when none).
    const std::string &TrailingComment() const;
    void SetTrailingComment(std::string comment);

    friend bool operator==(const ScriptVal &a, const ScriptVal &b);
    friend bool operator!=(const ScriptVal &a, const ScriptVal &b) { return !(a == b); }

    /// Lua table text. Scalars and small tables of scalars stay on one line;
    /// nested tables indent by one tab per level.
    std::string ToText(int indent = 0) const;
    /// Parses one value (optionally preceded by `return`). Throws ScriptParseError.
    static ScriptVal FromText(std::string_view text);
    /// The same, reporting what parses but is suspect (a key given twice in
    /// one table: the later value wins) into `notes` instead of passing it by.
    static ScriptVal FromText(std::string_view text, std::vector<ScriptParseError> *notes);

private:
    Type type_ = Type::Nil;
    bool bool_ = false;
    double number_ = 0.0;
    std::string text_;
    std::shared_ptr<std::vector<Entry>> table_; // copy-on-write
    // Leading entries known to hold the keys 1, 2, ... in order; never more than
    // the true run. Keeps Append and At O(1) on arrays.
    size_t arrayPrefix_ = 0;
    int line_ = 0, column_ = 0;
    struct Notes {
        std::vector<std::string> before;
        std::string after;
    };
    std::shared_ptr<const Notes> notes_; // null for the many values without comments
    void Detach();
    class Builder; // unchecked construction for the parser
};

} // namespace Orvane
