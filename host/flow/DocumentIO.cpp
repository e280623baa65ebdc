#include "host/flow/DocumentIO.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <limits>
#include <sys/stat.h>
#include <unistd.h>
#include <unordered_map>

#include "host/core/Registry.h"
#include "host/core/ScriptVal.h"
#include "host/core/Suggest.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputValue.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"

#ifndef ORVANE_VERSION
#define ORVANE_VERSION "0.0.0"
#endif

namespace Orvane {
namespace {

constexpr const char *DocumentClass = "Orvane.Document";
/// The preference that names a colour management configuration file.
constexpr const char *kColorConfigPref = "ColorConfig";
const std::vector<std::string> kTopEntries = {"Version", "Program", "GlobalRange", "RenderRange", "Prefs", "Tools"};
/// Documents larger than this are refused before reading (a flow of 50,000 tools is a few MiB).
constexpr size_t kMostDocumentBytes = size_t(512) << 20;

ScriptVal Range(double a, double b) {
    ScriptVal r = ScriptVal::Table();
    r.Append(a);
    r.Append(b);
    return r;
}

/// The document form of one input's value, or nil when it is not saved.
ScriptVal SavedValue(const Input &in) {
    if (in.Tags().GetBool(LinkNotSaved)) return ScriptVal();
    if (in.Link()) return ScriptVal::Ref(in.Link()->Owner()->Name() + "." + in.Link()->ID().Text());
    if (!in.UnresolvedLink().empty()) return ScriptVal::Ref(in.UnresolvedLink());
    if (in.Curve()) return in.Curve()->ToScript();
    if (!in.Constant() || (in.IsDefault() && !in.WrittenInDocument())) return ScriptVal();
    return in.Constant()->ToScript();
}

/// Reads one document into a document, collecting every problem.
class DocumentReader {
public:
    DocumentReader(OrvaneDoc &doc, const DocumentLoadOptions &options, DocumentLoadResult &result)
        : doc_(doc), options_(options), result_(result) {}

    void Read(const std::string &text) {
        ScriptVal root;
        std::vector<ScriptParseError> notes;
        try {
            root = ScriptVal::FromText(text, &notes);
        } catch (const ScriptParseError &e) {
            result_.problems.push_back({true, e.Line(), e.Column(), e.Message()});
            return;
        }
        for (const ScriptParseError &n : notes)
            result_.problems.push_back({!options_.lenient, n.Line(), n.Column(), n.Message()});
        if (!root.IsTable() || root.ClassName() != DocumentClass) {
            Fatal(&root, "not an Orvane document (it must start with Orvane.Document { ... })");
            return;
        }
        KeepComments("", root);
        ReadHeader(root);
        const ScriptVal *tools = root.Find("Tools");
        if (tools && !tools->IsTable()) {
            Fatal(tools, "Tools must be a table");
            return;
        }
        if (tools) ReadTools(*tools);
    }

private:
    OrvaneDoc &doc_;
    const DocumentLoadOptions &options_;
    DocumentLoadResult &result_;

    struct PendingValue {
        Operator *op;
        const ScriptVal *key, *value;
    };
    std::unordered_map<const Input *, const ScriptVal *> linkValues_; // for placing loop problems

    void Add(bool error, const ScriptVal *at, std::string message) {
        result_.problems.push_back({error, at ? at->Line() : 0, at ? at->Column() : 0, std::move(message)});
    }
    /// An error, or a warning when loading leniently.
    void Problem(const ScriptVal *at, std::string message) { Add(!options_.lenient, at, std::move(message)); }
    void Warn(const ScriptVal *at, std::string message) { Add(false, at, std::move(message)); }
    void Fatal(const ScriptVal *at, std::string message) { Add(true, at, std::move(message)); }

    void KeepComments(const std::string &place, const ScriptVal &v) {
        if (!v.Comments().empty() || !v.TrailingComment().empty())
            doc_.Comments()[place] = {v.Comments(), v.TrailingComment()};
    }

    // ---- document entries ----

    void ReadHeader(const ScriptVal &root) {
        for (const auto &[key, value] : root.Entries()) {
            if (!key.IsText()) {
                Warn(&key, "unknown document entry " + key.ToText() + " is kept as it is");
                doc_.KeptFields().Set(key, value);
                continue;
            }
            KeepComments(key.AsText(), value);
            if (std::find(kTopEntries.begin(), kTopEntries.end(), key.AsText()) == kTopEntries.end()) {
                Warn(&key, "unknown document entry '" + key.AsText() + "'" + DidYouMean(key.AsText(), kTopEntries) +
                               " is kept as it is");
                doc_.KeptFields().Set(key, value);
            }
        }
        if (const ScriptVal *v = root.Find("Version"); v && v->IsNumber() && v->AsNumber() > DocumentVersion)
            Warn(v, "the document's format version " + v->ToText() +
                        " is newer than this program's; parts it does not know are kept as they are");
        double a = 0, b = 0;
        if (ReadRange(root, "GlobalRange", a, b)) doc_.SetGlobalRange(a, b);
        if (ReadRange(root, "RenderRange", a, b)) doc_.SetRenderRange(a, b);
        if (const ScriptVal *prefs = root.Find("Prefs")) ReadPrefs(*prefs);
    }

    bool ReadRange(const ScriptVal &root, const char *name, double &a, double &b) {
        const ScriptVal *v = root.Find(name);
        if (!v) return false;
        const std::string what = name;
        if (!v->IsTable() || v->Size() != 2 || v->ArrayLength() != 2 || !v->At(1)->IsNumber() ||
            !v->At(2)->IsNumber()) {
            Problem(v, what + " must be { first, last } frames, got " + v->ToText());
            return false;
        }
        a = v->At(1)->AsNumber();
        b = v->At(2)->AsNumber();
        if (!std::isfinite(a) || !std::isfinite(b)) {
            Problem(v, what + " must be finite frames, got " + v->ToText());
            return false;
        }
        if (a > b) {
            Problem(v, what + " is reversed: it starts at " + ScriptVal(a).ToText() + ", after its end " +
                           ScriptVal(b).ToText());
            return false;
        }
        if (std::floor(b) - std::floor(a) + 1 > static_cast<double>(MaxFramesInRange)) {
            Problem(v, what + " covers " + ScriptVal(std::floor(b) - std::floor(a) + 1).ToText() + " frames; at most " +
                           std::to_string(MaxFramesInRange) + " are allowed");
            return false;
        }
        return true;
    }

    void ReadPrefs(const ScriptVal &prefs) {
        if (!prefs.IsTable()) {
            Problem(&prefs, "Prefs must be a table");
            return;
        }
        std::vector<std::string> names;
        for (int i = 0; i < PREF_Count; ++i) names.push_back(PrefName(static_cast<PrefID>(i)));
        for (const auto &[key, value] : prefs.Entries()) {
            const auto known = key.IsText() ? std::find(names.begin(), names.end(), key.AsText()) : names.end();
            if (key.IsText() && key.AsText() == kColorConfigPref) {
                if (value.IsText())
                    doc_.SetColorConfigPath(value.AsText());
                else
                    Problem(&value, "Prefs." + key.AsText() + ": expects a file name, got " + value.ToText());
            } else if (known == names.end()) {
                Warn(&key, "unknown preference " + key.ToText() +
                               (key.IsText() ? DidYouMean(key.AsText(), names) : std::string()) + " is kept as it is");
                doc_.KeptPrefs().Set(key, value);
            } else if (!value.IsNumber() || !std::isfinite(value.AsNumber())) {
                Problem(&value, "Prefs." + key.AsText() + ": expects a finite number, got " + value.ToText());
            } else {
                doc_.SetPref(static_cast<PrefID>(known - names.begin()), value.AsNumber());
            }
        }
    }

    // ---- tools ----

    std::vector<std::string> ClassNames() const {
        std::vector<std::string> names;
        for (const Registry *row : ClassRegistry ? ClassRegistry->Rows() : std::vector<const Registry *>{})
            if (row->CanCreate() && (row->TypeFlags() & RegKindOperator)) names.push_back(row->ID().Text());
        return names;
    }

    void ReadTools(const ScriptVal &tools) {
        std::vector<PendingValue> pending;
        std::vector<std::string> classNames; // made on the first unknown class
        for (const auto &[key, value] : tools.Entries()) {
            if (!key.IsText() || !value.IsTable() || value.ClassName().empty()) {
                Problem(&key, (key.IsText() ? key.AsText() : key.ToText()) + ": expected Name = Class { ... }");
                continue;
            }
            const std::string &name = key.AsText();
            if (!IsToolName(name)) {
                Problem(&key, "'" + name + "' is not a tool name (letters, digits and _, not starting with a digit)");
                continue;
            }
            KeepComments("Tools." + name, value);
            const Registry *row = ClassRegistry ? ClassRegistry->FindByName(value.ClassName()) : nullptr;
            Operator *op = row && (row->TypeFlags() & RegKindOperator) ? doc_.AddTool(row->ID(), name) : nullptr;
            if (!op) {
                if (classNames.empty()) classNames = ClassNames();
                Problem(&value, name + ": unknown class '" + value.ClassName() + "'" +
                                    DidYouMean(value.ClassName(), classNames) + "; the tool is kept as it is");
                doc_.KeptTools().Set(key, value);
                continue;
            }
            if (op->IsPlaceholder())
                Warn(&value,
                     name + ": the " + row->DisplayName() + " tool is not available yet; its settings are kept");
            for (const auto &[field, fieldValue] : value.Entries())
                if (!(field.IsText() && field.AsText() == "Inputs")) op->KeptFields().Set(field, fieldValue);
            const ScriptVal *inputs = value.Find("Inputs");
            if (inputs && !inputs->IsTable()) {
                Problem(inputs, name + ".Inputs must be a table");
                continue;
            }
            if (inputs)
                for (const auto &[inputKey, inputValue] : inputs->Entries())
                    pending.push_back({op, &inputKey, &inputValue});
        }
        // Values first in the order written; those that fail (an input made by another value, such as a
        // layer's, or a choice among inputs linked later) are tried again once everything else is set.
        std::vector<PendingValue> again;
        for (const PendingValue &p : pending)
            if (!Apply(p, false)) again.push_back(p);
        for (const PendingValue &p : again) Apply(p, true);
        CheckLoops();
    }

    /// Sets one input from the document; false when it did not take. `last`: report what is wrong.
    bool Apply(const PendingValue &p, bool last) {
        Operator &op = *p.op;
        Input *in = p.key->IsText() ? op.FindInput(p.key->AsText().c_str()) : nullptr;
        if (!in) {
            if (!last) return false;
            if (!op.IsPlaceholder()) {
                std::vector<std::string> ids;
                for (const auto &i : op.Inputs()) ids.push_back(i->ID().Text());
                const std::string word = p.key->IsText() ? p.key->AsText() : p.key->ToText();
                Problem(p.key,
                        op.Name() + ": unknown input '" + word + "'" + DidYouMean(word, ids) + "; it is kept as it is");
            }
            op.KeptInputs().Set(*p.key, *p.value);
            return true;
        }
        const std::string place = op.Name() + "." + in->ID().Text();
        const std::string problem =
            ApplyInputValue(doc_, in, *p.value,
                            {.keepUnknownLinks = options_.lenient, .lenient = options_.lenient, .checkLoops = false});
        if (!problem.empty() && !last) return false;
        in->SetWrittenInDocument(problem.empty());
        KeepComments("Tools." + op.Name() + ".Inputs." + in->ID().Text(), *p.value);
        if (!problem.empty()) Problem(p.value, place + ": " + problem);
        if (in->Link()) linkValues_[in] = p.value;
        if (!in->UnresolvedLink().empty())
            Warn(p.value, place + ": linked to " + in->UnresolvedLink() +
                              ", which this program does not have; the link is kept");
        return true;
    }

    /// Links are made without a loop check each (that would cost the length of the chain per link); one walk over
    /// the whole flow finds any loop, reports it where the closing link is written and takes that link out.
    void CheckLoops() {
        enum Mark : uint8_t { Unseen, Open, Done };
        std::unordered_map<const Operator *, Mark> marks;
        struct Frame {
            Operator *op;
            size_t next; // index of the next input to follow
        };
        for (Operator *start : doc_.Tools()) {
            if (marks[start] != Unseen) continue;
            std::vector<Frame> stack{{start, 0}};
            marks[start] = Open;
            while (!stack.empty()) {
                Frame &f = stack.back();
                if (f.next == f.op->Inputs().size()) {
                    marks[f.op] = Done;
                    stack.pop_back();
                    continue;
                }
                Input *in = f.op->Inputs()[f.next++].get();
                if (!in->Link()) continue;
                Operator *up = in->Link()->Owner();
                const Mark m = marks[up];
                if (m == Open) {
                    const auto at = linkValues_.find(in);
                    Problem(at == linkValues_.end() ? nullptr : at->second,
                            f.op->Name() + "." + in->ID().Text() + ": the link to " + up->Name() + "." +
                                in->Link()->ID().Text() + " closes a loop; it is taken out");
                    in->Disconnect();
                } else if (m == Unseen) {
                    marks[up] = Open;
                    stack.push_back({up, 0});
                }
            }
        }
    }
};

ScriptVal Commented(ScriptVal v, const OrvaneDoc &doc, const std::string &place) {
    const auto c = doc.Comments().find(place);
    if (c != doc.Comments().end()) {
        v.SetComments(c->second.before);
        v.SetTrailingComment(c->second.after);
    }
    return v;
}

void Summarise(DocumentLoadResult &r) {
    // In the order of the text, as a reader goes through it; problems without a place last.
    std::stable_sort(r.problems.begin(), r.problems.end(), [](const DocumentProblem &a, const DocumentProblem &b) {
        auto place = [](const DocumentProblem &p) {
            return std::pair(p.line > 0 ? p.line : std::numeric_limits<int>::max(), p.column);
        };
        return place(a) < place(b);
    });
    r.ok = std::none_of(r.problems.begin(), r.problems.end(), [](const DocumentProblem &p) { return p.error; });
    for (const DocumentProblem &p : r.problems) {
        if (!p.error) {
            r.warnings.push_back(ProblemText(p));
            continue;
        }
        if (!r.error.empty()) r.error += '\n';
        r.error += ProblemText(p);
    }
}

/// The whole of a regular file, opened without blocking (a FIFO would wait for a writer for ever).
bool ReadDocumentText(const std::string &path, std::string &text, std::string &error) {
    const int fd = open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) {
        error = "cannot open " + path + ": " + std::strerror(errno);
        return false;
    }
    struct stat st {};
    const bool regular = fstat(fd, &st) == 0 && S_ISREG(st.st_mode);
    if (!regular || static_cast<size_t>(st.st_size) > kMostDocumentBytes) {
        close(fd);
        error = path + (regular ? " is too large for a document" : " is not a regular file");
        return false;
    }
    text.resize(static_cast<size_t>(st.st_size));
    size_t got = 0;
    while (got < text.size()) {
        const ssize_t n = read(fd, text.data() + got, text.size() - got);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        got += static_cast<size_t>(n);
    }
    close(fd);
    text.resize(got);
    return true;
}

} // namespace

std::string ProblemText(const DocumentProblem &p) {
    if (p.line <= 0) return p.message;
    return "line " + std::to_string(p.line) + ", column " + std::to_string(p.column) + ": " + p.message;
}

DocumentLoadResult LoadDocument(const std::string &text, OrvaneDoc &doc, const DocumentLoadOptions &options) {
    DocumentLoadResult result;
    DocumentReader(doc, options, result).Read(text);
    Summarise(result);
    return result;
}

DocumentLoadResult LoadDocumentFile(const std::string &path, OrvaneDoc &doc, const DocumentLoadOptions &options) {
    std::string text, error;
    if (!ReadDocumentText(path, text, error)) {
        DocumentLoadResult r;
        r.problems.push_back({true, 0, 0, error});
        Summarise(r);
        return r;
    }
    std::error_code ec;
    const std::filesystem::path absolute = std::filesystem::absolute(path, ec);
    doc.SetFilePath(ec ? path : absolute.string());
    return LoadDocument(text, doc, options);
}

std::string SaveDocument(const OrvaneDoc &doc) {
    std::vector<ScriptVal::Entry> top;
    auto add = [&](const char *key, ScriptVal value) {
        top.emplace_back(ScriptVal(key), Commented(std::move(value), doc, key));
    };
    add("Version", DocumentVersion);
    add("Program", ORVANE_VERSION);
    add("GlobalRange", Range(doc.GlobalStart(), doc.GlobalEnd()));
    add("RenderRange", Range(doc.RenderStart(), doc.RenderEnd()));
    ScriptVal prefs = ScriptVal::Table();
    for (int id = 0; id < PREF_Count; ++id)
        if (doc.PrefIsSet(static_cast<PrefID>(id)))
            prefs.Set(PrefName(static_cast<PrefID>(id)), doc.GetPrefDouble(static_cast<PrefID>(id)));
    if (!doc.ColorConfigPath().empty()) prefs.Set(kColorConfigPref, doc.ColorConfigPath());
    for (const auto &[key, value] : doc.KeptPrefs().Entries()) prefs.Set(key, value);
    if (prefs.Size()) add("Prefs", std::move(prefs));

    // Known and kept tools together, sorted by name.
    std::vector<ScriptVal::Entry> tools;
    for (Operator *op : doc.Tools()) {
        const std::string place = "Tools." + op->Name();
        std::vector<ScriptVal::Entry> inputs;
        for (const auto &in : op->Inputs()) {
            ScriptVal v = SavedValue(*in);
            if (!v.IsNil())
                inputs.emplace_back(ScriptVal(in->ID().Text()),
                                    Commented(std::move(v), doc, place + ".Inputs." + in->ID().Text()));
        }
        ScriptVal inputTable = ScriptVal::TableOf({}, std::move(inputs));
        for (const auto &[key, value] : op->KeptInputs().Entries()) inputTable.Set(key, value);
        ScriptVal tool = ScriptVal::Table(op->ClassID().Text());
        if (inputTable.Size()) tool.Set("Inputs", std::move(inputTable));
        for (const auto &[key, value] : op->KeptFields().Entries()) tool.Set(key, value);
        tools.emplace_back(ScriptVal(op->Name()), Commented(std::move(tool), doc, place));
    }
    for (const auto &[key, value] : doc.KeptTools().Entries()) tools.emplace_back(key, value);
    std::sort(tools.begin(), tools.end(),
              [](const ScriptVal::Entry &x, const ScriptVal::Entry &y) { return x.first.AsText() < y.first.AsText(); });
    add("Tools", ScriptVal::TableOf({}, std::move(tools)));
    for (const auto &[key, value] : doc.KeptFields().Entries()) top.emplace_back(key, value);
    ScriptVal root = Commented(ScriptVal::TableOf(DocumentClass, std::move(top)), doc, "");
    return root.ToText() + "\n";
}

bool SaveDocumentFile(const OrvaneDoc &doc, const std::string &path, std::string &error) {
    const std::string text = SaveDocument(doc);
    const std::filesystem::path target(path);
    const std::filesystem::path temp =
        target.parent_path() / ("." + target.filename().string() + ".tmp" + std::to_string(getpid()));
    {
        std::ofstream out(temp, std::ios::binary | std::ios::trunc);
        if (!out) {
            error = "cannot write " + temp.string();
            return false;
        }
        out << text;
        out.flush();
        if (!out) {
            error = "cannot write " + temp.string();
            std::error_code ignored;
            std::filesystem::remove(temp, ignored);
            return false;
        }
    }
    std::error_code ec;
    std::filesystem::rename(temp, target, ec);
    if (ec) {
        error = "cannot replace " + path + ": " + ec.message();
        std::filesystem::remove(temp, ec);
        return false;
    }
    return true;
}

} // namespace Orvane
