#pragma once
// Setting an input from a script value, as documents and the command line
// give them:
//   a number, a point { x, y }, a text, an ID (text), a gradient
//   Curve { { time, value }, ... }   an animation curve
//   Tool.Output                      a link to another tool's output
// Values pass through the input's hard limits. An ID or text input also
// takes a bare word (Gradient) as its text.
//
// Thread safety: main thread, not during a render.
#include <string>

#include "host/core/Export.h"

namespace Orvane {

class Input;
class OrvaneDoc;
class ScriptVal;

/// Sets `in` from `v`; "" on success, else what is wrong in a few words. With
/// `keepUnknownLinks`, a link to a tool the document keeps but does not know
/// is remembered as an unresolved link instead of failing.
ORVANE_API std::string ApplyInputValue(OrvaneDoc &doc, Input *in, const ScriptVal &v, bool keepUnknownLinks);

/// "a number", "a point { x, y }", ... for messages.
ORVANE_API const char *ExpectedValueText(const Input *in);

} // namespace Orvane
