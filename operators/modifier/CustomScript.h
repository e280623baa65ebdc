#pragma once
// The Lua text of the Custom tool: the user's expressions, translated by the
// host Parser, placed in a fixed template of four parts.
//
//   preamble   compiler tuning, the sampler functions get<ch><edge>fn(img, x, y)
//   initfunc   run once per worker and frame: pixels, cursors, sizes, canvas
//              colours, the frame's random seed, the setup values s1..s8
//   pixfunc    one pixel: the intermediates i1..i8, then one stanza per
//              channel the output has (20 at most), each with c1..c3 (the
//              channel in images 1 to 3) and the channel's expression
//   chunkfunc  one line: the line's random seed, cursors to the line, then per
//              pixel the images' pixels (their canvas colour outside their
//              window), pixfunc, and the result written
//
// The text reads globals the tool sets per frame (out, img1..img4, time,
// _seed, dw0_* and dw1_*..dw4_* windows, proxy factors, n1..n8, p1x..p4z,
// self) and runs in the sandbox; only the template names the few ffi and jit
// calls the sandbox grants. An expression that does not parse becomes "0"
// and its error is returned.
//
// Thread safety: pure functions.
#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "host/script/Parser.h"

namespace Orvane {

/// The channels the Custom tool writes, in stanza order: R, G, B, A, then the script pixel's sixteen auxiliary
/// channels from Z (ScriptImageApi.h) in their order.
inline constexpr int kCustomChannels = 20;
/// The first auxiliary channel (Z) among them.
inline constexpr int kFirstAuxChannel = 4;

struct CustomScriptInput {
    std::array<std::string, 8> setup, intermediate;
    std::array<std::string, kCustomChannels> channel;
    /// Images 1 to 3 and the effect mask (4) present.
    std::array<bool, 4> images{};
    /// Bit per channel (stanza order) that the output image has; stanzas only for these.
    uint32_t outputChannels = 0xf;
    /// The output stores integers: colour is clamped to [0, 1] before it is written.
    bool integerOutput = false;
    /// Extra names of the number and point inputs (the tool's name fields).
    NameAliases aliases;
};

struct CustomScript {
    std::string text;
    uint64_t flags = 0; ///< ExpressionFlags of every expression that parsed
    /// "Red expression, column 3: ..." for each expression that did not parse.
    std::vector<std::string> errors;
};

CustomScript GenerateCustomScript(const CustomScriptInput &in);

} // namespace Orvane
