#pragma once
// Flow documents as text.
//
// A document is one ScriptVal, written in Lua table syntax and read back as
// data (never executed), made to live in version control:
//
//   Orvane.Document {
//       Version = 1,
//       Program = "0.1.0",
//       GlobalRange = { 0, 100 },
//       Prefs = { FrameWidth = 1280 },            -- only preferences that differ
//       Tools = {                                 -- sorted by name
//           BC1 = BrightnessContrast {
//               Inputs = {                         -- declaration order, non-defaults only
//                   Gain = Curve { { 0, 1 }, { 24, 2, Interp = "Smooth" } },
//                   Input = Background1.Output,     -- a link
//               },
//           },
//       },
//   }
//
// Saving what was loaded gives the same bytes. A class, input or entry this
// program does not know is kept, reported in one warning line, and written
// back unchanged. Saving writes a temporary file beside the target and
// renames it, so a failed save never leaves a damaged document.
//
// Thread safety: load and save on the main thread, not during a render.
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class OrvaneDoc;

constexpr int DocumentVersion = 1;

struct DocumentLoadResult {
    bool ok = false;
    std::string error; ///< one line: what is wrong, with line and column for syntax errors
    std::vector<std::string> warnings;
};

/// Reads a document into an empty `doc`.
ORVANE_API DocumentLoadResult LoadDocument(const std::string &text, OrvaneDoc &doc);
ORVANE_API DocumentLoadResult LoadDocumentFile(const std::string &path, OrvaneDoc &doc);

ORVANE_API std::string SaveDocument(const OrvaneDoc &doc);
/// Writes atomically; false with a reason when it could not.
ORVANE_API bool SaveDocumentFile(const OrvaneDoc &doc, const std::string &path, std::string &error);

} // namespace Orvane
