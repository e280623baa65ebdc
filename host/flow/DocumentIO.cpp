#include "host/flow/DocumentIO.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <unistd.h>

#include "host/core/Registry.h"
#include "host/core/ScriptVal.h"
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

ScriptVal Range(double a, double b) {
    ScriptVal r = ScriptVal::Table();
    r.Append(a);
    r.Append(b);
    return r;
}

bool ReadRange(const ScriptVal *v, double &a, double &b) {
    if (!v || !v->IsTable() || v->ArrayLength() != 2 || !v->At(1)->IsNumber() || !v->At(2)->IsNumber()) return false;
    a = v->At(1)->AsNumber();
    b = v->At(2)->AsNumber();
    return true;
}

/// The document form of one input's value, or nil when it is not saved.
ScriptVal SavedValue(const Input &in) {
    if (in.Tags().GetBool(LinkNotSaved)) return ScriptVal();
    if (in.Link()) return ScriptVal::Ref(in.Link()->Owner()->Name() + "." + in.Link()->ID().Text());
    if (!in.UnresolvedLink().empty()) return ScriptVal::Ref(in.UnresolvedLink());
    if (in.Curve()) return in.Curve()->ToScript();
    if (!in.Constant()) return ScriptVal();
    if (in.IsDefault() && !in.Tags().GetBool(LinkForceSave)) return ScriptVal();
    return in.Constant()->ToScript();
}

} // namespace

DocumentLoadResult LoadDocument(const std::string &text, OrvaneDoc &doc) {
    DocumentLoadResult result;
    ScriptVal root;
    try {
        root = ScriptVal::FromText(text);
    } catch (const ScriptParseError &e) {
        result.error = e.what();
        return result;
    }
    if (!root.IsTable() || root.ClassName() != DocumentClass) {
        result.error = "not an Orvane document (it must start with Orvane.Document { ... })";
        return result;
    }
    auto warn = [&result](std::string line) { result.warnings.push_back(std::move(line)); };

    if (const ScriptVal *v = root.Find("Version"); v && v->IsNumber() && v->AsNumber() > DocumentVersion)
        warn("the document's format version " + ScriptVal(v->AsNumber()).ToText() +
             " is newer than this program's; parts it does not know are kept as they are");
    double a, b;
    if (ReadRange(root.Find("GlobalRange"), a, b)) doc.SetGlobalRange(a, b);
    if (ReadRange(root.Find("RenderRange"), a, b)) doc.SetRenderRange(a, b);
    if (const ScriptVal *prefs = root.Find("Prefs"); prefs && prefs->IsTable()) {
        for (const auto &[key, value] : prefs->Entries()) {
            int id = -1;
            for (int i = 0; i < PREF_Count && key.IsText(); ++i)
                if (key.AsText() == PrefName(static_cast<PrefID>(i))) id = i;
            if (id < 0) {
                warn("unknown preference " + key.ToText() + " is kept as it is");
                doc.KeptPrefs().Set(key, value);
            } else if (!value.IsNumber()) {
                result.error = "Prefs." + key.AsText() + ": expects a number, got " + value.ToText();
                return result;
            } else {
                doc.SetPref(static_cast<PrefID>(id), value.AsNumber());
            }
        }
    }
    for (const auto &[key, value] : root.Entries()) {
        static const char *const known[] = {"Version", "Program", "GlobalRange", "RenderRange", "Prefs", "Tools"};
        bool isKnown = false;
        for (const char *k : known) isKnown = isKnown || (key.IsText() && key.AsText() == k);
        if (!isKnown) {
            warn("unknown document entry " + key.ToText() + " is kept as it is");
            doc.KeptFields().Set(key, value);
        }
    }

    const ScriptVal *tools = root.Find("Tools");
    if (tools && !tools->IsTable()) {
        result.error = "Tools must be a table";
        return result;
    }
    struct Pending {
        Operator *op;
        const ScriptVal *inputs;
    };
    std::vector<Pending> pending;
    if (tools) {
        // First every tool, so that links can name any of them.
        for (const auto &[key, value] : tools->Entries()) {
            if (!key.IsText() || !value.IsTable() || value.ClassName().empty()) {
                result.error = "Tools." + key.ToText() + ": expected Name = Class { ... }";
                return result;
            }
            const std::string &name = key.AsText();
            if (!IsToolName(name)) {
                result.error =
                    "Tools: '" + name + "' is not a tool name (letters, digits and _, not starting with a digit)";
                return result;
            }
            const OvID cls(value.ClassName());
            const Registry *row = ClassRegistry ? ClassRegistry->Find(cls) : nullptr;
            Operator *op = row ? doc.AddTool(cls, name) : nullptr;
            if (!op) {
                warn(name + ": unknown class '" + value.ClassName() + "'; the tool is kept as it is");
                doc.KeptTools().Set(key, value);
                continue;
            }
            if (op->IsPlaceholder())
                warn(name + ": the " + row->DisplayName() + " tool is not available yet; its settings are kept");
            for (const auto &[field, fieldValue] : value.Entries())
                if (!(field.IsText() && field.AsText() == "Inputs")) op->KeptFields().Set(field, fieldValue);
            const ScriptVal *inputs = value.Find("Inputs");
            if (inputs && !inputs->IsTable()) {
                result.error = name + ".Inputs must be a table";
                return result;
            }
            if (inputs) pending.push_back({op, inputs});
        }
        // Then the values and links.
        for (const Pending &p : pending) {
            for (const auto &[key, value] : p.inputs->Entries()) {
                Input *in = key.IsText() ? p.op->FindInput(key.AsText().c_str()) : nullptr;
                if (!in) {
                    if (!p.op->IsPlaceholder())
                        warn(p.op->Name() + ": unknown input " + key.ToText() + " is kept as it is");
                    p.op->KeptInputs().Set(key, value);
                    continue;
                }
                std::string error = ApplyInputValue(doc, in, value, true);
                if (!error.empty()) {
                    result.error = p.op->Name() + "." + in->ID().Text() + ": " + error;
                    return result;
                }
                if (!in->UnresolvedLink().empty())
                    warn(p.op->Name() + "." + in->ID().Text() + ": linked to " + in->UnresolvedLink() +
                         ", which this program does not have; the link is kept");
            }
        }
    }
    result.ok = true;
    return result;
}

DocumentLoadResult LoadDocumentFile(const std::string &path, OrvaneDoc &doc) {
    std::ifstream file(path, std::ios::binary);
    if (!file) {
        DocumentLoadResult r;
        r.error = "cannot open " + path;
        return r;
    }
    std::ostringstream text;
    text << file.rdbuf();
    std::error_code ec;
    const std::filesystem::path absolute = std::filesystem::absolute(path, ec);
    doc.SetFilePath(ec ? path : absolute.string());
    DocumentLoadResult r = LoadDocument(text.str(), doc);
    if (!r.ok) r.error = path + ": " + r.error;
    return r;
}

std::string SaveDocument(const OrvaneDoc &doc) {
    ScriptVal root = ScriptVal::Table(DocumentClass);
    root.Set("Version", DocumentVersion);
    root.Set("Program", ORVANE_VERSION);
    root.Set("GlobalRange", Range(doc.GlobalStart(), doc.GlobalEnd()));
    root.Set("RenderRange", Range(doc.RenderStart(), doc.RenderEnd()));
    ScriptVal prefs = ScriptVal::Table();
    for (int id = 0; id < PREF_Count; ++id)
        if (doc.PrefIsSet(static_cast<PrefID>(id)))
            prefs.Set(PrefName(static_cast<PrefID>(id)), doc.GetPrefDouble(static_cast<PrefID>(id)));
    for (const auto &[key, value] : doc.KeptPrefs().Entries()) prefs.Set(key, value);
    if (prefs.Size()) root.Set("Prefs", prefs);

    // Known and kept tools together, sorted by name.
    std::vector<std::pair<std::string, ScriptVal>> tools;
    for (Operator *op : doc.Tools()) {
        ScriptVal tool = ScriptVal::Table(op->ClassID().Text());
        ScriptVal inputs = ScriptVal::Table();
        for (const auto &in : op->Inputs()) {
            ScriptVal v = SavedValue(*in);
            if (!v.IsNil()) inputs.Set(in->ID().Text(), std::move(v));
        }
        for (const auto &[key, value] : const_cast<Operator *>(op)->KeptInputs().Entries()) inputs.Set(key, value);
        if (inputs.Size()) tool.Set("Inputs", std::move(inputs));
        for (const auto &[key, value] : const_cast<Operator *>(op)->KeptFields().Entries()) tool.Set(key, value);
        tools.emplace_back(op->Name(), std::move(tool));
    }
    for (const auto &[key, value] : doc.KeptTools().Entries()) tools.emplace_back(key.AsText(), value);
    std::sort(tools.begin(), tools.end(), [](const auto &x, const auto &y) { return x.first < y.first; });
    ScriptVal toolTable = ScriptVal::Table();
    for (auto &[name, tool] : tools) toolTable.Set(name, std::move(tool));
    root.Set("Tools", std::move(toolTable));
    for (const auto &[key, value] : doc.KeptFields().Entries()) root.Set(key, value);
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
