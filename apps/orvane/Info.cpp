// orvane info: what a file holds, as the file formats describe it
// (ImageFormat::DescribeFile), and with --sequence the frames and gaps of
// the numbered sequence it belongs to. Text is one "key  value" line per
// fact; --json prints one JSON array with an object per file (docs/EXR.md).
#include <fmt/core.h>

#include <cmath>
#include <filesystem>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/core/Registry.h"
#include "host/core/ScriptVal.h"
#include "host/core/Tags.h"
#include "host/media/Clip.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormatList.h"

namespace Orvane::Cli {
namespace {

struct InfoOptions {
    bool sequence = false, json = false;
};

/// "shot.%04d.exr" as "shot.####.exr" ("%d": one sign); other names as they are.
std::string HashPattern(const std::string &path) {
    const size_t at = path.rfind('%'), slash = path.rfind('/');
    if (at == std::string::npos || (slash != std::string::npos && at < slash)) return path;
    size_t end = at + 1;
    while (end < path.size() && std::isdigit(static_cast<unsigned char>(path[end]))) ++end;
    if (end >= path.size() || path[end] != 'd') return path;
    const int width = end > at + 1 ? std::atoi(path.c_str() + at + 1) : 1;
    if (width < 1 || width > 18) return path;
    return path.substr(0, at) + std::string(static_cast<size_t>(width), '#') + path.substr(end + 1);
}

/// The description of one file: path, format and what the format says.
ScriptVal DescribePath(const std::string &path) {
    ScriptVal entry = ScriptVal::Table();
    entry.Set("path", path);
    std::string error;
    std::unique_ptr<FileIO> io = FileIO::Open(path, FileIO::Mode::Read, error);
    Ref<ImageFormat> format = io ? FindFormatForReading(path, io.get(), error) : Ref<ImageFormat>();
    ScriptVal described;
    if (format && io->Seek(0, IOClass::SeekStart) && !format->DescribeFile(io.get(), described))
        error = path + ": " + (format->Error().empty() ? std::string("cannot read the header") : format->Error());
    if (format) format->Close();
    if (!error.empty()) {
        entry.Set("error", error);
        return entry;
    }
    const Registry *row = format->GetRegistry();
    entry.Set("format", row ? row->Tags().GetText(RegFormatName, row->ID().Text()) : "?");
    entry.Set("formatClass", row ? row->ID().Text() : "?");
    for (const auto &[key, value] : described.Entries()) entry.Set(key, value);
    return entry;
}

/// The file, or with a sequence the frame described and the frames found.
ScriptVal DescribeArgument(const std::string &arg, const InfoOptions &options) {
    const std::string pattern = HashPattern(arg);
    const bool named = pattern.find('#') != std::string::npos;
    if (!named && !options.sequence) return DescribePath(arg);
    Clip clip(pattern);
    std::string error;
    if (!clip.IsSequence()) return DescribePath(arg); // a name without a number is no sequence
    if (!clip.Scan(error)) {
        ScriptVal entry = ScriptVal::Table();
        entry.Set("path", arg);
        entry.Set("error", error);
        return entry;
    }
    // The file named when it exists, else the sequence's first.
    std::error_code ec;
    ScriptVal entry = DescribePath(!named && std::filesystem::is_regular_file(arg, ec) ? arg : clip.FramePath(0));
    const SequenceScan &found = clip.Found();
    ScriptVal seq = ScriptVal::Table(), gaps = ScriptVal::Table();
    seq.Set("pattern", SequenceDisplayName(clip.Sequence()));
    seq.Set("first", static_cast<double>(found.frames.front()));
    seq.Set("last", static_cast<double>(found.frames.back()));
    seq.Set("files", static_cast<double>(found.frames.size()));
    for (const auto &[first, last] : found.gaps) {
        ScriptVal gap = ScriptVal::Table();
        gap.Append(static_cast<double>(first)).Append(static_cast<double>(last));
        gaps.Append(gap);
    }
    seq.Set("missing", gaps);
    entry.Set("sequence", seq);
    return entry;
}

// ---- text ----

std::string Number(double v) {
    if (std::isfinite(v) && std::fabs(v) < 9.0e15 && v == std::floor(v)) return fmt::format("{:.0f}", v);
    return ScriptVal(v).ToText();
}

/// A value on one line: texts quoted, lists in brackets, tables in braces.
std::string Compact(const ScriptVal &v) {
    if (v.IsText()) return JsonString(v.AsText()); // quoted, line breaks and controls escaped
    if (v.IsNumber()) return Number(v.AsNumber());
    if (v.IsBool()) return v.AsBool() ? "true" : "false";
    if (!v.IsTable()) return "nil";
    const bool list = v.ArrayLength() == v.Size();
    std::string out = list ? "(" : "{";
    for (const auto &[k, e] : v.Entries()) {
        if (out.size() > 1) out += ", ";
        if (!list) out += (k.IsText() ? k.AsText() : Compact(k)) + " = ";
        out += Compact(e);
    }
    return out + (list ? ")" : "}");
}

std::string Text(const ScriptVal &t, const char *key) {
    const ScriptVal *v = t.Find(key);
    return !v ? std::string() : v->IsText() ? v->AsText() : Compact(*v);
}

double Num(const ScriptVal &t, const char *key) {
    const ScriptVal *v = t.Find(key);
    return v && v->IsNumber() ? v->AsNumber() : 0.0;
}

/// "x0,y0 - x1,y1" of a { x0, y0, x1, y1 } list.
std::string Box(const ScriptVal *b) {
    if (!b || b->ArrayLength() != 4) return "?";
    auto n = [b](size_t i) { return Number(b->At(i)->AsNumber()); };
    return n(1) + "," + n(2) + " - " + n(3) + "," + n(4);
}

void Line(int indent, const std::string &key, const std::string &value) {
    fmt::print("{:{}}{:<{}} {}\n", "", indent, key, 34 - indent, value);
}

std::string ChannelText(const ScriptVal &c, bool sampling) {
    std::string s = Text(c, "name") + " " + Text(c, "type");
    if (sampling) s += ", sampling " + Number(Num(c, "xSampling")) + " " + Number(Num(c, "ySampling"));
    if (const ScriptVal *linear = c.Find("pLinear"); sampling && linear && linear->AsBool()) s += ", plinear";
    return s;
}

/// `"name", view v, ` of a part, the parts it has.
std::string PartName(const ScriptVal &p) {
    std::string s = Text(p, "name").empty() ? "" : "\"" + Text(p, "name") + "\", ";
    return Text(p, "view").empty() ? s : s + "view " + Text(p, "view") + ", ";
}

void PrintPart(const ScriptVal &p) {
    Line(2, "part " + Number(Num(p, "index")), PartName(p) + Text(p, "type"));
    Line(4, "data window (file, y down)", Box(p.Find("dataWindow")));
    Line(4, "display window (file, y down)", Box(p.Find("displayWindow")));
    Line(4, "compression", Text(p, "compression"));
    Line(4, "line order", Text(p, "lineOrder"));
    if (const ScriptVal *t = p.Find("tiles"))
        Line(4, "tiles",
             Number(Num(*t, "xSize")) + " x " + Number(Num(*t, "ySize")) + ", " + Text(*t, "levelMode") + ", round " +
                 Text(*t, "roundingMode"));
    if (const ScriptVal *cs = p.Find("channels"))
        for (const auto &[k, c] : cs->Entries()) Line(4, "channel", ChannelText(c, true));
    if (const ScriptVal *as = p.Find("attributes"))
        for (const auto &[k, a] : as->Entries())
            Line(4, "attribute", Text(a, "name") + " " + Text(a, "type") + ": " + Compact(*a.Find("value")));
}

void PrintText(const ScriptVal &e) {
    const ScriptVal *seq = e.Find("sequence");
    fmt::print("{}\n", seq ? Text(*seq, "pattern") : Text(e, "path"));
    Line(2, "format", Text(e, "format") + " (" + Text(e, "formatClass") + ")");
    if (seq) {
        Line(2, "frame file", Text(e, "path"));
        Line(2, "frames",
             Number(Num(*seq, "first")) + " - " + Number(Num(*seq, "last")) + " (" + Number(Num(*seq, "files")) +
                 " files)");
        for (const auto &[k, gap] : seq->Find("missing")->Entries()) {
            const double a = gap.At(1)->AsNumber(), b = gap.At(2)->AsNumber();
            Line(2, "missing", a == b ? Number(a) : Number(a) + " - " + Number(b));
        }
    }
    if (e.Find("readError")) {
        Line(2, "cannot read", Text(e, "readError"));
    } else {
        Line(2, "size",
             Number(Num(e, "width")) + " x " + Number(Num(e, "height")) + ", pixel aspect " +
                 Number(Num(e, "pixelAspect")));
        Line(2, "image", Text(e, "imageDepth"));
        Line(2, "data window (image, y up)", Box(e.Find("dataWindow")));
    }
    std::string channels;
    if (const ScriptVal *cs = e.Find("channels"))
        for (const auto &[k, c] : cs->Entries()) channels += (channels.empty() ? "" : ", ") + ChannelText(c, false);
    Line(2, "channels", channels);
    const ScriptVal *exr = e.Find("openexr");
    if (!exr) {
        if (const ScriptVal *md = e.Find("metadata"))
            for (const auto &[k, v] : md->Entries())
                Line(2, "metadata", (k.IsText() ? k.AsText() : Compact(k)) + " = " + Compact(v));
        return;
    }
    Line(2, "openexr version", Number(Num(*exr, "version")) + (exr->Find("multiPart")->AsBool() ? ", multi-part" : ""));
    if (const ScriptVal *views = exr->Find("views"); views && views->Size()) {
        std::string list;
        for (const auto &[k, v] : views->Entries()) list += (list.empty() ? "" : ", ") + v.AsText();
        Line(2, "views", list);
    }
    if (exr->Find("partRead")) {
        const ScriptVal *parts = exr->Find("parts");
        const ScriptVal *read = parts->At(static_cast<size_t>(Num(*exr, "partRead")) + 1);
        const std::string name = read && !Text(*read, "name").empty() ? " \"" + Text(*read, "name") + "\"" : "";
        const std::string view = Text(*exr, "viewRead").empty() ? "" : ", view " + Text(*exr, "viewRead");
        Line(2, "reads", "part " + Number(Num(*exr, "partRead")) + name + view);
        std::string slots;
        for (const auto &[k, v] : exr->Find("slots")->Entries())
            slots += (slots.empty() ? "" : " ") + k.AsText() + "=" + v.AsText();
        Line(2, "slots", slots);
    }
    for (const auto &[k, p] : exr->Find("parts")->Entries()) PrintPart(p);
}

// ---- JSON ----

/// A list of up to 16 plain values ("dataWindow": [0, 0, 10, 10]).
bool IsShortList(const ScriptVal &v) {
    if (!v.IsTable() || v.ArrayLength() != v.Size() || v.Size() > 16) return false;
    for (const auto &[k, e] : v.Entries())
        if (e.IsTable()) return false;
    return true;
}

/// JSON of a value: lists (tables with keys 1..n, empty ones too) as arrays,
/// other tables as objects; short lists and small objects of plain values
/// (a channel, an attribute) on one line.
void Json(const ScriptVal &v, std::string &out, int indent) {
    if (v.IsText()) {
        out += JsonString(v.AsText());
        return;
    }
    if (v.IsNumber() || v.IsBool() || !v.IsTable()) {
        out += v.IsBool()                                    ? (v.AsBool() ? "true" : "false")
               : v.IsNumber() && std::isfinite(v.AsNumber()) ? Number(v.AsNumber())
                                                             : "null";
        return;
    }
    const bool list = v.ArrayLength() == v.Size();
    bool oneLine = list ? IsShortList(v) : v.Size() <= 6;
    for (const auto &[k, e] : v.Entries()) oneLine = oneLine && (!e.IsTable() || (!list && IsShortList(e)));
    const std::string pad = oneLine ? " " : "\n" + std::string(static_cast<size_t>(indent + 2), ' ');
    out += list ? "[" : "{";
    bool first = true;
    for (const auto &[k, e] : v.Entries()) {
        out += first ? (list && oneLine ? "" : pad) : "," + pad;
        if (!list) out += JsonString(k.IsText() ? k.AsText() : Compact(k)) + ": ";
        Json(e, out, indent + 2);
        first = false;
    }
    if (v.Size()) out += oneLine ? (list ? "" : " ") : "\n" + std::string(static_cast<size_t>(indent), ' ');
    out += list ? "]" : "}";
}

} // namespace

int RunInfo(const std::vector<std::string> &args) {
    InfoOptions options;
    std::vector<std::string> files;
    for (const std::string &a : args) {
        if (a == "--sequence")
            options.sequence = true;
        else if (a == "--json")
            options.json = true;
        else if (a.size() > 1 && a[0] == '-' && a[1] == '-')
            throw CliError(ExitUsage, "info: unexpected option '" + a + "'");
        else
            files.push_back(a);
    }
    if (files.empty()) throw CliError(ExitUsage, "info: expected one or more files");
    LoadLibrary();
    bool allRead = true;
    ScriptVal all = ScriptVal::Table();
    for (const std::string &path : files) {
        ScriptVal entry = DescribeArgument(path, options);
        if (const ScriptVal *error = entry.Find("error")) {
            allRead = false;
            fmt::print(stderr, "ERROR: {}\n", error->AsText());
        } else if (!options.json) {
            PrintText(entry);
        }
        all.Append(entry);
    }
    if (options.json) {
        std::string out;
        Json(all, out, 0);
        fmt::print("{}\n", out);
    }
    return allRead ? ExitOk : ExitFailed;
}

} // namespace Orvane::Cli
