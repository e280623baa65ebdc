#pragma once
// Setting an input from a script value, as documents and the command line
// give them:
//   a number, a point { x, y }, a text, an ID (text), a gradient
//   a list choice by number or by name ("Screen", as describe prints it)
//   Curve { { time, value }, ... }   an animation curve
//   Tool.Output                      a link to another tool's output
// An ID, text or list input also takes a bare word (Gradient) as its text.
//
// Values are checked before they are set: numbers must be finite and inside
// the input's hard limits, whole where the input is whole, a choice must be
// one of the list's. A problem is returned as a few words ("-2 is below the
// least allowed value 0"), with "did you mean" where a name is close.
//
// Thread safety: main thread, not during a render.
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class Input;
class OrvaneDoc;
class ScriptVal;

struct InputValueOptions {
    /// A link to a tool the document keeps but does not know is remembered
    /// as an unresolved link instead of failing.
    bool keepUnknownLinks = false;
    /// A number outside the limits or not whole is brought inside and set all
    /// the same; the problem is still returned, for a warning.
    bool lenient = false;
    /// False when the caller checks the whole flow for loops once, after
    /// linking many tools (documents).
    bool checkLoops = true;
};

/// Sets `in` from `v`; "" on success, else what is wrong in a few words.
ORVANE_API std::string ApplyInputValue(OrvaneDoc &doc, Input *in, const ScriptVal &v,
                                       const InputValueOptions &options = {});

/// A value as a user types it on a command line: script syntax (numbers,
/// "text", { x, y }, Curve { ... }, Tool.Output, a choice name), and for
/// text, file and ID inputs any other text as it stands
/// (renders/a.####.exr). Throws std::invalid_argument saying what the input
/// expects when the text is none of these.
ORVANE_API ScriptVal InputValueFromText(const OrvaneDoc &doc, const Input *in, const std::string &text);

/// One entry of a list control: its label and, in ID lists, its ID.
struct InputChoice {
    std::string label, id;
};
/// The entries of a list control (empty for other inputs).
ORVANE_API std::vector<InputChoice> InputChoices(const Input *in);

/// "a number", "a point { x, y }", ... for messages.
ORVANE_API const char *ExpectedValueText(const Input *in);

} // namespace Orvane
