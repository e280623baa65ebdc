// orvane colorspaces: what a colour configuration offers.
#include <algorithm>

#include <fmt/format.h>

#include "apps/orvane/Cli.h"
#include "host/color/ColorConfig.h"

namespace Orvane::Cli {

namespace {
std::string Joined(const std::vector<std::string> &words) {
    std::string text;
    for (const std::string &w : words) text += (text.empty() ? "" : ", ") + w;
    return text;
}
} // namespace

int RunColorSpaces(const std::vector<std::string> &args) {
    std::string path;
    bool named = false;
    for (size_t i = 0; i < args.size(); ++i) {
        if (args[i] == "--config" && i + 1 < args.size())
            path = args[++i], named = true;
        else
            throw CliError(ExitUsage, "colorspaces: unexpected argument '" + args[i] + "'");
    }
    if (named && path.empty()) throw CliError(ExitUsage, "colorspaces: --config needs a file name");
    std::string error;
    const auto config = named ? ColorConfig::Load(path, &error) : ColorConfig::ForDocument(nullptr, &error);
    if (!config) throw CliError(ExitFailed, "colorspaces: " + error);

    fmt::print("configuration: {}\n\ncolour spaces:\n", config->Source());
    const std::vector<ColorSpaceInfo> spaces = config->Spaces();
    size_t width = 0;
    for (const ColorSpaceInfo &s : spaces) width = std::max(width, s.name.size());
    for (const ColorSpaceInfo &s : spaces) {
        std::string line = fmt::format("  {:<{}}  {:<10}", s.name, width, s.family.empty() ? "-" : s.family);
        if (!s.aliases.empty()) line += "  aliases: " + Joined(s.aliases);
        fmt::print("{}\n", line.erase(line.find_last_not_of(' ') + 1));
    }
    fmt::print("\nroles:\n");
    for (const auto &[role, space] : config->Roles()) fmt::print("  {:<18} {}\n", role, space);
    return ExitOk;
}

} // namespace Orvane::Cli
