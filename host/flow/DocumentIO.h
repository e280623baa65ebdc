#pragma once
// Flow documents as text.
//
// A document is one ScriptVal, written in Lua table syntax and read back as
// data (never executed), made to live in version control:
//
//   -- comments before the document and before any entry are kept
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
// Loading checks the whole document and reports every problem at once, each
// with its line and column: an unknown class or input, a choice that does
// not exist, a value outside an input's limits, of the wrong type or not
// finite, a key given twice, a bad range, a link to nothing or in a loop.
// Names close to a known one come with "did you mean". Any error fails the
// load; lenient loading takes errors as warnings and goes on (values are
// brought inside their limits, what cannot be used is left at its default).
// A class or input this program does not know is kept and written back
// unchanged in lenient loading. A class is found by its ID, an old ID, an
// alias or its name, and saved under its ID.
//
// Saving writes values that differ from their defaults or that the document
// gave, the kept parts, and the comments the document was read with. Saving what was loaded gives the
// same bytes for a document this program wrote. Saving writes a temporary
// file beside the target and renames it, so a failed save never leaves a
// damaged document. Loading and saving take time linear in the document.
//
// Thread safety: load and save on the main thread, not during a render.
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class OrvaneDoc;

constexpr int DocumentVersion = 1;

struct DocumentProblem {
    bool error = true;
    int line = 0, column = 0; ///< 0: not tied to a place in the text
    std::string message;      ///< "BC1: unknown input 'Gian' (did you mean 'Gain'?)"
};

struct DocumentLoadOptions {
    /// Errors that do not stop the document from loading become warnings.
    bool lenient = false;
};

struct DocumentLoadResult {
    bool ok = false;
    /// Every problem, errors and warnings, in the order found.
    std::vector<DocumentProblem> problems;
    /// The same, as "line L, column C: message" lines: every error, and every warning.
    std::string error;
    std::vector<std::string> warnings;
};

/// "line 12, column 5: message", or the message alone without a place.
ORVANE_API std::string ProblemText(const DocumentProblem &problem);

/// Reads a document into an empty `doc`.
ORVANE_API DocumentLoadResult LoadDocument(const std::string &text, OrvaneDoc &doc,
                                           const DocumentLoadOptions &options = {});
ORVANE_API DocumentLoadResult LoadDocumentFile(const std::string &path, OrvaneDoc &doc,
                                               const DocumentLoadOptions &options = {});

ORVANE_API std::string SaveDocument(const OrvaneDoc &doc);
/// Writes atomically; false with a reason when it could not.
ORVANE_API bool SaveDocumentFile(const OrvaneDoc &doc, const std::string &path, std::string &error);

} // namespace Orvane
