// orvane tools, orvane describe: what the class registry holds.
#include <algorithm>
#include <cctype>
#include <fmt/core.h>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/core/Registry.h"
#include "host/core/Suggest.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputValue.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/media/Clip.h"

namespace Orvane::Cli {
namespace {

std::string Lower(std::string s) {
    for (char &c : s) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return s;
}

std::string KindWord(uint32_t flags) {
    switch (flags & RegFamilyMask) {
    case RegFamilyTransition: return "transition";
    case RegFamilyDataType: return "data type";
    case RegFamilyImageFormat: return "format";
    case RegFamilyPreviewControl: return "preview control";
    case RegFamilyShape: return "shape tool";
    case RegFamilyMaterial: return "material";
    default: break;
    }
    if (flags == 0) return "abstract";
    if (flags & RegKindSubInputs) return "sub-inputs";
    if (flags & RegKindModifier) return "modifier";
    if (flags & RegKindMask) return "mask";
    if (flags & RegKindTerminal) return "terminal";
    if (flags & RegKindSource) return "source";
    if (flags & RegKindTool) return "tool";
    return "operator";
}

/// What a class can do beyond its kind, in words.
std::string Attributes(const Registry &row) {
    const uint32_t flags = row.TypeFlags();
    const TagList &t = row.Tags();
    std::vector<std::string> words;
    if (flags & RegKindTwoImage) words.push_back("two-image");
    if (flags & RegKindVariableInputs) words.push_back("variable-inputs");
    if (flags & RegKind3D) words.push_back("3D");
    if (t.GetBool(RegSupportsRoI)) words.push_back("regions");
    if (t.GetBool(RegSupportsDoD)) words.push_back("domains");
    if (t.GetBool(RegSupportsGPUImages)) words.push_back("device");
    if (t.GetBool(RegNoCache) || t.GetBool(RegUnpredictable)) words.push_back("uncached");
    std::string out;
    for (const std::string &w : words) out += (out.empty() ? "" : ",") + w;
    return out.empty() ? "-" : out;
}

const char *BuiltWord(const Registry &row) {
    if (!row.CanCreate()) return "-";
    return row.Tags().GetBool(RegPlanned) ? "not yet" : "yes";
}

std::string Joined(const TagList &tags, Tag tag) {
    std::string out;
    for (const TagItem *item : tags.FindAll(tag)) {
        if (!out.empty()) out += ", ";
        out += KindOfTag(tag) == TagKind::ID ? item->AsID().Text() : item->AsText();
    }
    return out;
}

bool Matches(const Registry &row, const std::string &word) {
    const std::string w = Lower(word);
    auto has = [&w](const char *text) { return text && Lower(text).find(w) != std::string::npos; };
    if (has(row.ID().Text()) || has(row.ClassName()) || has(row.DisplayName())) return true;
    if (has(row.Tags().GetText(RegCategory))) return true;
    for (const TagItem *alias : row.Tags().FindAll(RegAlias))
        if (has(alias->AsText())) return true;
    return false;
}

const Registry &FindClass(const std::string &name) {
    const Registry *row = ClassRegistry ? ClassRegistry->FindByName(name) : nullptr;
    if (!row) {
        std::vector<std::string> ids;
        for (const Registry *r : ClassRegistry ? ClassRegistry->Rows() : std::vector<const Registry *>{})
            ids.push_back(r->ID().Text());
        throw CliError(ExitUsage, "unknown class '" + name + "'" + DidYouMean(name, ids) + " (see orvane tools)");
    }
    return *row;
}

std::string ControlWord(OvID control) {
    std::string text = control.Text();
    if (text.size() > 7 && text.compare(text.size() - 7, 7, "Control") == 0) text.resize(text.size() - 7);
    return text;
}

/// A value on one line (gradients and other tables print across lines).
std::string ValueText(const Ref<Parameter> &v) {
    if (!v) return "-";
    std::string text = v->ToScript().ToText(), line;
    bool space = false;
    for (char c : text) {
        if (c == '\n' || c == '\t') {
            space = true;
            continue;
        }
        if (space && !line.empty() && line.back() != ' ') line += ' ';
        space = false;
        line += c;
    }
    return line;
}

std::string TypeWord(OvID type) {
    if (type == CLSID_DataType_Number) return "number";
    if (type == CLSID_DataType_Point) return "point";
    if (type == CLSID_DataType_Text) return "text";
    if (type == CLSID_DataType_OvID) return "id";
    if (type == CLSID_DataType_Image) return "image";
    if (type == CLSID_DataType_Mask) return "mask";
    if (type == CLSID_DataType_Gradient) return "gradient";
    return Lower(type.Text());
}

/// One input as describe shows it: the type and control, then default, limits and notes.
struct InputLine {
    std::string id, label, type, details;
    std::vector<std::string> choices; ///< "Label" (ID or number)
};

InputLine DescribeInput(const Input &in) {
    const TagList &t = in.Tags();
    InputLine line{in.ID().Text(), *in.Label() ? std::string(in.Label()) : in.Name(), TypeWord(in.DataType()), {}, {}};
    std::vector<std::string> parts;
    if (t.Has(InputControl)) line.type += ", " + ControlWord(t.GetID(InputControl));
    if (IsImageDataType(in.DataType())) {
        parts.push_back(in.IsRequired() ? "required" : "optional");
        if (in.MainIndex()) parts.push_back("connector " + std::to_string(in.MainIndex()));
    } else {
        parts.push_back("default " + ValueText(in.Default()));
    }
    if (t.Has(InputMinAllowed) || t.Has(InputMaxAllowed))
        parts.push_back("limits " +
                        (t.Has(InputMinAllowed) ? ScriptVal(t.GetDouble(InputMinAllowed)).ToText() : "-inf") + ".." +
                        (t.Has(InputMaxAllowed) ? ScriptVal(t.GetDouble(InputMaxAllowed)).ToText() : "inf"));
    if (t.Has(InputSliderLow) || t.Has(InputSliderHigh))
        parts.push_back("slider " + ScriptVal(t.GetDouble(InputSliderLow, 0.0)).ToText() + ".." +
                        ScriptVal(t.GetDouble(InputSliderHigh, 1.0)).ToText());
    if (in.IsInteger()) parts.push_back("integer");
    if (in.IsPassive()) parts.push_back("passive");
    if (!in.IsVisible()) parts.push_back("hidden");
    if (!in.IsExternal()) parts.push_back("not animatable");
    if (in.Priority() != 0 && in.Priority() != PriorityImage)
        parts.push_back("priority " + std::to_string(in.Priority()));
    std::string accepted;
    for (const TagItem *id : t.FindAll(ListAcceptedId))
        accepted += (accepted.empty() ? "" : ", ") + std::string(id->AsID().Text());
    if (!accepted.empty()) parts.push_back("also takes " + accepted);
    for (const std::string &p : parts) line.details += (line.details.empty() ? "" : ", ") + p;
    const auto choices = InputChoices(&in);
    for (size_t i = 0; i < choices.size(); ++i)
        line.choices.push_back("\"" + choices[i].label + "\" (" +
                               (choices[i].id.empty() ? std::to_string(i) : choices[i].id) + ")");
    return line;
}

void PrintInput(const InputLine &in) {
    std::string line = "  " + in.id;
    line.resize(std::max<size_t>(line.size() + 1, 30), ' ');
    line += "\"" + in.label + "\"";
    line.resize(std::max<size_t>(line.size() + 1, 58), ' ');
    fmt::print("{}{}, {}\n", line, in.type, in.details);
    if (in.choices.empty()) return;
    std::string list = "      choices: ";
    for (size_t i = 0; i < in.choices.size(); ++i) list += (i ? ", " : "") + in.choices[i];
    fmt::print("{}\n", list);
}

/// Calls `onPage` with a page's name and tab icon ("" for none) where a new page begins, `onNest` with the caption of
/// each fold of controls where it begins, then `onInput` for each input, in order.
template <class OnPage, class OnNest, class OnInput>
void ForEachInputByPage(const Operator &op, OnPage onPage, OnNest onNest, OnInput onInput) {
    int page = -2;
    for (const auto &in : op.Inputs()) {
        if (in->Page() != page) {
            page = in->Page();
            const auto &pages = op.Pages();
            const bool known = page >= 0 && page < static_cast<int>(pages.size());
            const char *icon = known ? pages[page].tags.GetPtrAs<const char>(PageIcon) : nullptr;
            onPage(known ? pages[page].name : std::string("Controls"), std::string(icon ? icon : ""));
        }
        for (const ControlNest &nest : op.Nests())
            if (nest.firstInput == in->Index() && nest.endInput > nest.firstInput) onNest(nest.name);
        onInput(*in);
    }
}

/// Markdown table cells must not hold '|' or line breaks.
std::string Cell(std::string text) {
    std::string out;
    for (char c : text) out += c == '|' ? std::string("\\|") : c == '\n' ? std::string(" ") : std::string(1, c);
    return out;
}

void PrintMarkdown(const Registry &row, const Operator *op) {
    const TagList &t = row.Tags();
    fmt::print("# {} (`{}`)\n\n", row.DisplayName(), row.ID().Text());
    if (const char *help = t.GetText(RegHelp)) fmt::print("{}\n\n", help);
    fmt::print("| | |\n|---|---|\n");
    fmt::print("| Kind | {} |\n", KindWord(row.TypeFlags()));
    if (const char *category = t.GetText(RegCategory)) fmt::print("| Category | {} |\n", Cell(category));
    if (const std::string a = Joined(t, RegAlias); !a.empty()) fmt::print("| Also named | {} |\n", Cell(a));
    fmt::print("| Attributes | {} |\n", Attributes(row));
    fmt::print("| Built | {} |\n", BuiltWord(row));
    if (!op) return;
    ForEachInputByPage(
        *op,
        [](const std::string &page, const std::string &icon) {
            fmt::print("\n## Page \"{}\"\n\n", page);
            if (!icon.empty()) fmt::print("Tab icon: `{}`\n\n", icon);
            fmt::print("| ID | Label | Type | Details |\n|---|---|---|---|\n");
        },
        [](const std::string &nest) { fmt::print("| | **{}** | group | |\n", Cell(nest)); },
        [](const Input &in) {
            const InputLine line = DescribeInput(in);
            std::string details = line.details;
            if (!line.choices.empty()) {
                details += "; choices: ";
                for (size_t i = 0; i < line.choices.size(); ++i) details += (i ? ", " : "") + line.choices[i];
            }
            fmt::print("| `{}` | {} | {} | {} |\n", line.id, Cell(line.label), Cell(line.type), Cell(details));
        });
    fmt::print("\n## Outputs\n\n| ID | Type |\n|---|---|\n");
    for (const auto &out : op->Outputs()) fmt::print("| `{}` | {} |\n", out->ID().Text(), TypeWord(out->DataType()));
}

} // namespace

int RunTools(const std::vector<std::string> &args) {
    std::string search;
    bool all = false;
    for (size_t i = 0; i < args.size(); ++i) {
        if (args[i] == "--search" && i + 1 < args.size())
            search = args[++i];
        else if (args[i] == "--all")
            all = true;
        else
            throw CliError(ExitUsage, "tools: unexpected argument '" + args[i] + "'");
    }
    LoadLibrary();
    std::vector<const Registry *> rows = ClassRegistry ? ClassRegistry->Rows() : std::vector<const Registry *>{};
    std::sort(rows.begin(), rows.end(), [](const Registry *a, const Registry *b) { return a->ID() < b->ID(); });
    fmt::print("{:<28} {:<30} {:<16} {:<28} {:<16} {}\n", "CLASS", "NAME", "KIND", "ATTRIBUTES", "CATEGORY", "BUILT");
    size_t shown = 0;
    for (const Registry *row : rows) {
        if (!search.empty() && !Matches(*row, search)) continue;
        // Abstract bases and hidden classes are no one's tools; --all shows them too.
        if (!all && (row->TypeFlags() == 0 || row->Tags().GetBool(RegHidden))) continue;
        const char *category = row->Tags().GetText(RegCategory, "-");
        fmt::print("{:<28} {:<30} {:<16} {:<28} {:<16} {}\n", row->ID().Text(), row->DisplayName(),
                   KindWord(row->TypeFlags()), Attributes(*row), category, BuiltWord(*row));
        ++shown;
    }
    fmt::print("{} classes\n", shown);
    return ExitOk;
}

int RunDescribe(const std::vector<std::string> &args) {
    std::vector<std::string> names;
    bool markdown = false;
    for (const std::string &a : args) {
        if (a == "--markdown")
            markdown = true;
        else if (a.rfind("--", 0) == 0)
            throw CliError(ExitUsage, "describe: unknown option " + a);
        else
            names.push_back(a);
    }
    if (names.size() != 1) throw CliError(ExitUsage, "describe: expected one class name");
    LoadLibrary();
    const Registry &row = FindClass(names[0]);
    OrvaneDoc doc;
    Operator *op = nullptr;
    if ((row.TypeFlags() & RegKindOperator) && row.CanCreate()) {
        op = doc.AddTool(row.ID(), "Describe1");
        if (!op) throw CliError(ExitFailed, std::string("cannot make a ") + row.ID().Text());
        // A tool that reads clips adds a format's options to its Format page when
        // a file of that format is named; one name per format shows them all.
        if (Input *clip = row.Tags().GetBool(RegClipSourceTool) ? op->FindInput("Clip") : nullptr) {
            std::vector<const Registry *> formats = ClassRegistry->Rows();
            std::sort(formats.begin(), formats.end(),
                      [](const Registry *a, const Registry *b) { return a->ID() < b->ID(); });
            for (const Registry *f : formats)
                if (f->IsRegClassType(RegFamilyImageFormat) && f->Tags().GetBool(RegFormatCanLoad) &&
                    f->Tags().GetBool(RegFormatHasOptions) && f->Tags().GetText(RegFormatExtension))
                    clip->SetValue(MakeRef<Clip>(std::string("file") + f->Tags().GetText(RegFormatExtension)));
        }
    }
    if (markdown) {
        PrintMarkdown(row, op);
        return ExitOk;
    }
    const TagList &t = row.Tags();
    fmt::print("{}: \"{}\" ({}; attributes: {})\n", row.ID().Text(), row.DisplayName(), KindWord(row.TypeFlags()),
               Attributes(row));
    auto field = [&t](const char *label, Tag tag) {
        if (const char *text = t.GetText(tag)) fmt::print("  {:<14} {}\n", label, text);
    };
    field("class word:", RegClassName);
    field("path:", RegPath);
    field("category:", RegCategory);
    field("abbreviation:", RegAbbreviation);
    field("help:", RegHelp);
    field("icon:", RegIcon);
    if (!row.BaseID().IsNull()) fmt::print("  {:<14} {}\n", "base:", row.BaseID().Text());
    if (const std::string a = Joined(t, RegAlias); !a.empty()) fmt::print("  {:<14} {}\n", "aliases:", a);
    if (const std::string o = Joined(t, RegOldClassId); !o.empty()) fmt::print("  {:<14} {}\n", "old IDs:", o);
    fmt::print("  {:<14} {}\n", "built:", BuiltWord(row));
    if (!op) return ExitOk;
    ForEachInputByPage(
        *op,
        [](const std::string &page, const std::string &icon) {
            fmt::print("\npage \"{}\"{}\n", page, icon.empty() ? std::string() : " (tab icon " + icon + ")");
        },
        [](const std::string &nest) { fmt::print("  group \"{}\"\n", nest); },
        [](const Input &in) { PrintInput(DescribeInput(in)); });
    fmt::print("\noutputs\n");
    for (const auto &out : op->Outputs()) fmt::print("  {:<28} {}\n", out->ID().Text(), TypeWord(out->DataType()));
    return ExitOk;
}

} // namespace Orvane::Cli
