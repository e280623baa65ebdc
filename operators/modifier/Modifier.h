#pragma once
// What the modifiers share: the title that names what a modifier drives.
//
// Thread safety: main thread (titles are read by views and the command line).
#include <initializer_list>
#include <string>

namespace Orvane {

class Output;

/// "`what` on TOOL: INPUT" for the first input linked to one of `outputs`
/// (in order), or "" when none is linked.
std::string DrivenTitle(const std::string &what, std::initializer_list<const Output *> outputs);

} // namespace Orvane
