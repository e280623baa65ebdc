#pragma once
// The expression language of the Custom tool and the Expression modifier,
// translated to Lua text for LuaJIT.
//
// An expression such as `if(a1 > 0, r1 / a1, 0) * n1` is parsed by hand
// (recursive descent) into a tree, checked against a fixed table of names, and
// written out as one fully parenthesised Lua expression. The Lua text can only
// name what this translator chooses: the locals of LuaPrelude(), the pixel and
// input variables listed in docs/EXPRESSIONS.md and the host's sampler and
// input functions. The language has no strings, fields, indexing, methods,
// statements or comments, and any name outside the table is an error, so an
// expression cannot reach the Lua libraries, the FFI or the file system.
//
// Thread safety: a Parser is used by one thread at a time; separate Parsers
// are independent. LuaPrelude() may be called from any thread.
#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

/// Where an expression runs, which decides the names it may use.
enum class ExpressionContext {
    Pixel, ///< a channel or intermediate expression of the Custom tool: all names
    Setup, ///< a setup expression of the Custom tool: no per-pixel values (x, y, r1, c1, i1 ...)
    Number ///< the Expression modifier: n1..n9, p1x..p9y, their _at forms, time, maths, random
};

/// Channels of a pixel an expression can read, in the order of their flags.
enum class ExpressionChannel {
    R,
    G,
    B,
    A,
    BgR,
    BgG,
    BgB,
    BgA,
    Z,
    Coverage,
    U,
    V,
    NX,
    NY,
    NZ,
    VectX,
    VectY,
    BackVectX,
    BackVectY,
    PositionX,
    PositionY,
    PositionZ,
    DisparityX,
    DisparityY,
    Count
};

/// What the expressions given to one Parser used, as bits of GetFlags().
namespace ExpressionFlags {
inline constexpr uint64_t Image1 = 1ull << 0; ///< any value of image 1: channel, sampler, size, c1
inline constexpr uint64_t Image2 = 1ull << 1;
inline constexpr uint64_t Image3 = 1ull << 2;
inline constexpr uint64_t Sampler1 = 1ull << 3; ///< image 1 sampled away from the current pixel
inline constexpr uint64_t Sampler2 = 1ull << 4;
inline constexpr uint64_t Sampler3 = 1ull << 5;
inline constexpr uint64_t Position = 1ull << 6; ///< x or y
inline constexpr uint64_t Time = 1ull << 7;
inline constexpr uint64_t Random = 1ull << 8;
inline constexpr uint64_t Numbers = 1ull << 9;      ///< n1 ...
inline constexpr uint64_t Points = 1ull << 10;      ///< p1x ...
inline constexpr uint64_t Luts = 1ull << 11;        ///< lut1(v) ...
inline constexpr uint64_t TimedInputs = 1ull << 12; ///< n1_at(t), p1x_at(t) ...
inline constexpr uint64_t Current = 1ull << 13;     ///< c1, c2, c3: the channel being written, of images 1 to 3
inline constexpr uint64_t OutputSize = 1ull << 14;  ///< w, h, ax, ay
/// Bit of a channel read as a variable or through a sampler (bits 16 to 39).
constexpr uint64_t Channel(ExpressionChannel c) { return 1ull << (16 + static_cast<int>(c)); }
/// Bit of setup value s1 to s8 (bits 40 to 47) and intermediate i1 to i8 (bits 48 to 55).
constexpr uint64_t SetupValue(int k) { return 1ull << (39 + k); }
constexpr uint64_t IntermediateValue(int k) { return 1ull << (47 + k); }
} // namespace ExpressionFlags

/// Where and why an expression failed.
struct ParseError {
    int position = 0; ///< 1-based column (byte) of the fault; one past the end for a missing tail
    std::string message;
    /// "column 7: unknown name 'rr1' (did you mean 'r1'?)"
    ORVANE_API std::string Describe() const;
};

/// Extra names for names of the language ("speed" for "n1"): a name the
/// language does not know is looked up here and read as the name it stands
/// for. Names of the language always keep their own meaning.
using NameAliases = std::unordered_map<std::string, std::string>;

/// The extra names a tool's "Name for Number/Point" fields give: numberNames[k - 1]
/// names n<k> (and n<k>_at with `timedForms`); pointNames[k - 1] followed by x or y
/// (and z with `withZ`) names p<k>x .. (and their _at forms). Empty names and
/// texts that are not names (a letter, then letters, digits, '_') are skipped.
ORVANE_API NameAliases InputNameAliases(const std::vector<std::string> &numberNames,
                                        const std::vector<std::string> &pointNames, bool timedForms, bool withZ);

class ORVANE_API Parser {
public:
    /// Translates one expression. On success sets `luaText` (not null) to a Lua
    /// expression giving a number, and adds to the flags; on failure sets
    /// `error` (when given) and leaves `luaText` and the flags unchanged. The
    /// caller then uses its default: the Custom tool writes one console line
    /// with Describe() and uses "0". `aliases`, when given, adds names.
    bool Parse(std::string_view text, ExpressionContext context, std::string *luaText, ParseError *error,
               const NameAliases *aliases = nullptr);

    /// The flags of every successful Parse since construction or ClearFlags().
    uint64_t GetFlags() const { return flags_; }
    void ClearFlags() { flags_ = 0; }

    /// Lua statements that bind the maths the translated text calls (locals
    /// named with a leading underscore, read from the global `math`). A script
    /// places them once before the functions that hold translated text.
    static const std::string &LuaPrelude();

private:
    uint64_t flags_ = 0;
};

} // namespace Orvane
