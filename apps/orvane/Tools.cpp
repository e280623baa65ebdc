// orvane tools, orvane describe: what the class registry holds.
#include <algorithm>
#include <cctype>
#include <fmt/core.h>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
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
    const Registry *row = ClassRegistry ? ClassRegistry->Find(OvID(name)) : nullptr;
    if (!row && ClassRegistry) // a class word or display name names it too
        for (const Registry *r : ClassRegistry->Rows())
            if (Lower(r->ClassName()) == Lower(name) || Lower(r->DisplayName()) == Lower(name)) {
                row = r;
                break;
            }
    if (!row) throw CliError(ExitUsage, "unknown class '" + name + "' (see orvane tools)");
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

void PrintInput(const Input &in) {
    const TagList &t = in.Tags();
    std::string line = "  " + std::string(in.ID().Text());
    line.resize(std::max<size_t>(line.size() + 1, 30), ' ');
    line += "\"" + (*in.Label() ? std::string(in.Label()) : in.Name()) + "\"";
    line.resize(std::max<size_t>(line.size() + 1, 58), ' ');
    line += TypeWord(in.DataType());
    if (t.Has(InputControl)) line += ", " + ControlWord(t.GetID(InputControl));
    if (IsImageDataType(in.DataType())) {
        line += in.IsRequired() ? ", required" : ", optional";
        if (in.MainIndex()) line += ", connector " + std::to_string(in.MainIndex());
    } else {
        line += ", default " + ValueText(in.Default());
    }
    if (t.Has(InputMinAllowed) || t.Has(InputMaxAllowed)) {
        line += ", limits ";
        line += t.Has(InputMinAllowed) ? ScriptVal(t.GetDouble(InputMinAllowed)).ToText() : "-inf";
        line += "..";
        line += t.Has(InputMaxAllowed) ? ScriptVal(t.GetDouble(InputMaxAllowed)).ToText() : "inf";
    }
    if (t.Has(InputSliderLow) || t.Has(InputSliderHigh))
        line += ", slider " + ScriptVal(t.GetDouble(InputSliderLow, 0.0)).ToText() + ".." +
                ScriptVal(t.GetDouble(InputSliderHigh, 1.0)).ToText();
    if (in.IsInteger()) line += ", integer";
    if (in.IsPassive()) line += ", passive";
    if (!in.IsVisible()) line += ", hidden";
    if (!in.IsExternal()) line += ", not animatable";
    if (in.Priority() != 0 && in.Priority() != PriorityImage) line += ", priority " + std::to_string(in.Priority());
    fmt::print("{}\n", line);
    const auto items = t.FindAll(ListAddItem);
    const auto ids = t.FindAll(ListItemId);
    if (!items.empty()) {
        std::string list = "      choices: ";
        for (size_t i = 0; i < items.size(); ++i) {
            if (i) list += ", ";
            list += std::string("\"") + items[i]->AsText() + "\"";
            if (i < ids.size())
                list += std::string(" (") + ids[i]->AsID().Text() + ")";
            else if (in.DataType() == CLSID_DataType_Number)
                list += " (" + std::to_string(i) + ")";
        }
        fmt::print("{}\n", list);
    }
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
    fmt::print("{:<28} {:<30} {:<16} {:<8} {:<16} {}\n", "CLASS", "NAME", "KIND", "FLAGS", "CATEGORY", "BUILT");
    size_t shown = 0;
    for (const Registry *row : rows) {
        if (!search.empty() && !Matches(*row, search)) continue;
        // Abstract bases and hidden classes are no one's tools; --all shows them too.
        if (!all && (row->TypeFlags() == 0 || row->Tags().GetBool(RegHidden))) continue;
        const char *category = row->Tags().GetText(RegCategory, "-");
        fmt::print("{:<28} {:<30} {:<16} {:<8} {:<16} {}\n", row->ID().Text(), row->DisplayName(),
                   KindWord(row->TypeFlags()).c_str(), row->TypeFlags(), category, BuiltWord(*row));
        ++shown;
    }
    fmt::print("{} classes\n", shown);
    return ExitOk;
}

int RunDescribe(const std::vector<std::string> &args) {
    if (args.size() != 1) throw CliError(ExitUsage, "describe: expected one class name");
    LoadLibrary();
    const Registry &row = FindClass(args[0]);
    const TagList &t = row.Tags();
    fmt::print("{}: \"{}\" ({}, kind {})\n", row.ID().Text(), row.DisplayName(), KindWord(row.TypeFlags()),
               row.TypeFlags());
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
    if (!(row.TypeFlags() & RegKindOperator) || !row.CanCreate()) return ExitOk;

    OrvaneDoc doc;
    Operator *op = doc.AddTool(row.ID(), "Describe1");
    if (!op) throw CliError(ExitFailed, std::string("cannot make a ") + row.ID().Text());
    // A tool that reads clips adds a format's options to its Format page when
    // a file of that format is named; one name per format shows them all.
    if (Input *clip = t.GetBool(RegClipSourceTool) ? op->FindInput("Clip") : nullptr) {
        std::vector<const Registry *> formats = ClassRegistry->Rows();
        std::sort(formats.begin(), formats.end(),
                  [](const Registry *a, const Registry *b) { return a->ID() < b->ID(); });
        for (const Registry *f : formats)
            if (f->IsRegClassType(RegFamilyImageFormat) && f->Tags().GetBool(RegFormatCanLoad) &&
                f->Tags().GetBool(RegFormatHasOptions) && f->Tags().GetText(RegFormatExtension))
                clip->SetValue(MakeRef<Clip>(std::string("file") + f->Tags().GetText(RegFormatExtension)));
    }
    int page = -1;
    for (const auto &in : op->Inputs()) {
        if (in->Page() != page) {
            page = in->Page();
            const auto &pages = op->Pages();
            fmt::print("\npage \"{}\"\n",
                       page >= 0 && page < static_cast<int>(pages.size()) ? pages[page].name : std::string("Controls"));
        }
        PrintInput(*in);
    }
    fmt::print("\noutputs\n");
    for (const auto &out : op->Outputs()) fmt::print("  {:<28} {}\n", out->ID().Text(), TypeWord(out->DataType()));
    return ExitOk;
}

} // namespace Orvane::Cli
