#pragma once
// Header attributes of OpenEXR files as script values, shared by the format
// (Metadata) and the script interface (operators/media/EXRIO.h): numbers and
// text as they are, compound types as tables whose class name is the
// attribute's type ("v2f { 1, 2 }"), time codes as "hh:mm:ss:ff".
//
// Thread safety: pure functions; EnsureThreads is once per process.
#include <memory>
#include <string>

#include <ImfAttribute.h>

#include "host/core/ScriptVal.h"

namespace Orvane::exrfmt {

/// The value of `a`; nil for types with no script form (channel lists, previews, opaque data).
/// `hint` gets the type of numbers and time codes.
ScriptVal AttributeValue(const Imf::Attribute &a, std::string &hint);
/// The attribute `v` maps to (numbers take the type `hint` names, else float); null when it has none.
std::unique_ptr<Imf::Attribute> MakeAttribute(const std::string &name, const ScriptVal &v, const std::string &hint);
/// Sets the library's worker threads and the largest image size it accepts, once per process.
void EnsureThreads();

} // namespace Orvane::exrfmt
