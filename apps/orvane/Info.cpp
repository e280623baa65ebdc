// orvane info: what the formats read from files and sequences.
#include <fmt/core.h>

#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/core/Tags.h"
#include "host/media/Clip.h"

namespace Orvane::Cli {
namespace {

std::string Rect(const ImgRectI &r) { return fmt::format("{},{} - {},{}", r.x0, r.y0, r.x1, r.y1); }

const char *DepthName(int depth) {
    static const char *const names[] = {"?",         "int8 mask",  "int16 mask",   "float16 mask", "float32 mask",
                                        "RGBA int8", "RGBA int16", "RGBA float16", "RGBA float32"};
    return depth >= 1 && depth <= 8 ? names[depth] : names[0];
}

/// Prints one file or sequence; false when it could not be read.
bool Describe(const std::string &path) {
    Clip clip(path);
    std::string error;
    if (!clip.Scan(error)) {
        fmt::print(stderr, "ERROR: {}\n", error);
        return false;
    }
    Ref<Image> header = clip.GetFrameTagList(0, {{ClipFrameHeaderOnly, 1}}, error);
    if (!header) {
        fmt::print(stderr, "ERROR: {}\n", error);
        return false;
    }
    const Ref<ImageFormat> &format = clip.ReadFormat();
    const Registry *row = format ? format->GetRegistry() : nullptr;
    fmt::print("{}\n", clip.IsSequence() ? SequenceDisplayName(clip.Sequence()) : path);
    fmt::print("  format        {}\n", row ? row->Tags().GetText(RegFormatName, row->ID().Text()) : "?");
    fmt::print("  size          {} x {}, {}, pixel aspect {}:{}\n", header->Width(), header->Height(),
               DepthName(header->Depth()), header->XScale(), header->YScale());
    fmt::print("  data window   {}\n", Rect(header->DataWindow()));
    if (clip.IsSequence()) {
        const SequenceScan &found = clip.Found();
        fmt::print("  frames        {} - {} ({} files)\n", found.frames.front(), found.frames.back(),
                   found.frames.size());
        for (const auto &[first, last] : found.gaps)
            fmt::print("  missing       {}\n",
                       first == last ? fmt::format("{}", first) : fmt::format("{} - {}", first, last));
    }
    if (header->Metadata().IsTable() && header->Metadata().Size())
        fmt::print("  metadata      {}\n", header->Metadata().ToText(1));
    return true;
}

} // namespace

int RunInfo(const std::vector<std::string> &args) {
    if (args.empty()) throw CliError(ExitUsage, "info: expected one or more files");
    LoadLibrary();
    bool allRead = true;
    for (const std::string &path : args) allRead = Describe(path) && allRead;
    return allRead ? ExitOk : ExitFailed;
}

} // namespace Orvane::Cli
