#pragma once
// OrvaneDoc: a flow document. It owns the tools (by unique name) and their
// links, the document preferences (frame format, cache budget, ...), the
// global time range, and the console where tools report.
//
// Console lines are kept in order and passed to an optional listener as they
// come; tools write failures under ConsoleError (code 60).
//
// Thread safety: tools, links and preferences change on the main thread
// between renders. PrintF and DocExecute may be called from any thread.
#include <cstdarg>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "host/core/Object.h"
#include "host/core/ScriptVal.h"

namespace Orvane {

class Operator;
class Request;
class ResultCache;

/// Console codes.
constexpr int ConsoleLog = 0;
constexpr int ConsoleWarning = 50;
constexpr int ConsoleError = 60;

/// Preferences that tools read with GetPrefLong / GetPrefDouble.
enum PrefID : int {
    PREF_FFWidth,
    PREF_FFHeight,
    PREF_FFAspectX,
    PREF_FFAspectY,
    PREF_FFDepth,
    PREF_FFFrameRate,
    PREF_FFFields,
    PREF_CacheMemoryMB,
    PREF_UseGPU,
    PREF_ImageOverlay,
    PREF_MaskFilter, ///< default soft-edge filter of masks: 0 Box, 1 Bartlett, 2 Multi-box, 3 Gaussian, 4 Fast Gaussian
    PREF_Count
};
/// The name of a preference in documents.
ORVANE_API const char *PrefName(PrefID id);

struct FrameFormat {
    int width = 1920, height = 1080, depth = 8;
    double aspectX = 1.0, aspectY = 1.0, frameRate = 24.0;
    bool fields = false;
};

/// Longest render or global range a document may have, in frames.
constexpr int64_t MaxFramesInRange = 10'000'000;

/// Comments a writer put in a document, kept to be written back.
struct DocumentComments {
    std::vector<std::string> before; ///< whole lines before the entry
    std::string after;               ///< on the entry's own line, after it
};

struct ConsoleLine {
    int code;
    std::string text;
};

/// True for names a tool may have in a document.
ORVANE_API bool IsToolName(const std::string &name);

class ORVANE_API OrvaneDoc : public RefObject {
public:
    OrvaneDoc();
    ~OrvaneDoc() override;

    // ---- preferences ----
    long GetPrefLong(PrefID id) const;
    double GetPrefDouble(PrefID id) const;
    void SetPref(PrefID id, double value);
    /// True when the preference differs from its default.
    bool PrefIsSet(PrefID id) const;
    FrameFormat GetFrameFormat() const;
    /// Hash of every preference (results may depend on them: cache keys).
    uint64_t PrefsHash() const;
    /// The colour management configuration file (preference ColorConfig; ""
    /// when not set: host/color/ColorConfig.h says what is used then).
    const std::string &ColorConfigPath() const { return colorConfig_; }
    void SetColorConfigPath(std::string path) { colorConfig_ = std::move(path); }

    // ---- console ----
    void PrintF(int code, const char *fmt, ...) __attribute__((format(printf, 3, 4)));
    void PrintF(Request *req, int code, const char *fmt, ...) __attribute__((format(printf, 4, 5)));
    void VPrintF(int code, const char *fmt, va_list args);
    std::vector<ConsoleLine> ConsoleLines() const;
    void ClearConsole();
    void SetConsoleListener(std::function<void(const ConsoleLine &)> listener);

    // ---- time ----
    double GlobalStart() const { return globalStart_; }
    double GlobalEnd() const { return globalEnd_; }
    void SetGlobalRange(double start, double end) {
        globalStart_ = start;
        globalEnd_ = end;
    }
    double RenderStart() const { return renderStart_; }
    double RenderEnd() const { return renderEnd_; }
    void SetRenderRange(double start, double end) {
        renderStart_ = start;
        renderEnd_ = end;
    }

    // ---- files ----
    /// Where the document was read from or saved to ("" when never).
    const std::string &FilePath() const { return filePath_; }
    void SetFilePath(std::string path) { filePath_ = std::move(path); }
    /// A file name as tools use it: relative names are taken from the
    /// document's folder (when it has one), absolute names stay as they are.
    std::string MapPath(const std::string &name) const;

    // ---- tools ----
    /// Makes a tool of the class (or of the class an old ID names) and adds
    /// it under `name` (a fresh name from its abbreviation when empty). Null
    /// for an unknown or abstract class or a name in use.
    Operator *AddTool(OvID classId, const std::string &name = {});
    /// Adds a tool made elsewhere; the document takes a reference. Names are
    /// identifiers (letters, digits, '_', not starting with a digit) so that
    /// links can name them as Tool.Output.
    bool AddTool(Operator *op, const std::string &name);
    bool RemoveTool(const std::string &name);
    Operator *FindTool(const std::string &name) const;
    /// Tools sorted by name.
    std::vector<Operator *> Tools() const;
    /// A name not in use, from `base` (its letters and digits) and a number ("Blur1").
    std::string UniqueName(const std::string &base) const;

    /// Tools of classes this program does not know, and top-level entries it
    /// does not understand, kept as read to be written back unchanged.
    ScriptVal &KeptTools() { return keptTools_; }
    ScriptVal &KeptFields() { return keptFields_; }
    const ScriptVal &KeptTools() const { return keptTools_; }
    const ScriptVal &KeptFields() const { return keptFields_; }
    ScriptVal &KeptPrefs() { return keptPrefs_; }
    const ScriptVal &KeptPrefs() const { return keptPrefs_; }

    /// Comments of a hand-written document by where they stand: "" before
    /// the document, "Tools.BC1" before a tool, "Tools.BC1.Inputs.Gain"
    /// before one of its inputs, "RenderRange" before a document entry.
    /// Removing a tool drops its comments.
    std::map<std::string, DocumentComments> &Comments() { return comments_; }
    const std::map<std::string, DocumentComments> &Comments() const { return comments_; }

    /// The result cache shared by this document's renders.
    ResultCache &Cache() { return *cache_; }

    /// Edits that a tool asks for while it renders (the values a pick found),
    /// queued under a name an undo list would show, and run in order on the
    /// main thread by RunDeferred once the render is over. DocExecute may be
    /// called from any thread.
    void DocExecute(std::function<void(OrvaneDoc &)> edit, std::string undoName);
    /// Runs the queued edits in order; returns their names.
    std::vector<std::string> RunDeferred();

    /// A write-protected document keeps its values as they are: tools that
    /// would write their own controls while rendering (a height kept in
    /// aspect, centred offsets) leave them alone.
    bool IsWriteProtected() const { return writeProtected_; }
    void SetWriteProtected(bool on) { writeProtected_ = on; }

private:
    double prefs_[PREF_Count];
    std::string colorConfig_;
    mutable std::mutex consoleLock_;
    std::vector<ConsoleLine> console_;
    std::function<void(const ConsoleLine &)> listener_;
    double globalStart_ = 0, globalEnd_ = 100, renderStart_ = 0, renderEnd_ = 100;
    std::map<std::string, Ref<Operator>> tools_;
    std::unique_ptr<ResultCache> cache_;
    bool writeProtected_ = false;
    std::string filePath_;
    ScriptVal keptTools_ = ScriptVal::Table(), keptFields_ = ScriptVal::Table(), keptPrefs_ = ScriptVal::Table();
    std::map<std::string, DocumentComments> comments_;
    std::mutex deferredLock_;
    std::vector<std::pair<std::function<void(OrvaneDoc &)>, std::string>> deferred_;
};

} // namespace Orvane
