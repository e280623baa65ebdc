#pragma once
// The value an input of a tool holds at any time, for tools whose values
// depend on other times than the request's: a modifier that reads its
// operands at a scaled or offset time, an expression's n1_at(t). A linked
// input asks the linked tool (a modifier, or any tool with a Number or Point
// output) for its value at that time, within the request's render; an
// unlinked one reads its constant or curve. At the request's own time the
// value already fetched for the input is used.
//
// Time-shifted asks carry ReqFlagTimeShifted, so the tool asked can tell them
// from the frame's own.
//
// Thread safety: call from the request's render thread (Process or
// CheckRequest), not from chunks: a linked tool is evaluated on the caller's
// thread.
#include "host/flow/Parameter.h"

namespace Orvane {

class Input;
class Request;

/// Request flag of a value asked at another time than the frame's own.
constexpr uint32_t ReqFlagTimeShifted = 1u << 26;

/// The value `in` holds at `time` for `req`'s render (null `req`: outside any
/// render); null when a linked tool fails or an image input has no link.
ORVANE_API Ref<Parameter> InputValueAt(const Request *req, const Input *in, double time);
/// A number input's value at `time`; `fallback` when it has none (or fails).
ORVANE_API double InputNumberAt(const Request *req, const Input *in, double time, double fallback = 0.0);
/// A point input's value at `time`; (`fallbackX`, `fallbackY`) when it has none.
ORVANE_API void InputPointAt(const Request *req, const Input *in, double time, double &x, double &y,
                             double fallbackX = 0.0, double fallbackY = 0.0);

} // namespace Orvane
