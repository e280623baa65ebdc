#include "host/media/OutputFile.h"

#include <cctype>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>

#include "host/media/IOClass.h"

namespace Orvane {
namespace {

namespace fs = std::filesystem;

constexpr const char *kTempMark = ".orvane-tmp-";
constexpr auto kForeignTempAge = std::chrono::hours(1);

/// This host's name as it goes into temporary names (letters, digits, '.', '_', '-').
const std::string &HostName() {
    static const std::string name = [] {
        char buffer[256] = {};
        if (gethostname(buffer, sizeof buffer - 1) != 0 || !buffer[0]) return std::string("localhost");
        std::string n(buffer);
        for (char &c : n)
            if (!std::isalnum(static_cast<unsigned char>(c)) && c != '.' && c != '_' && c != '-') c = '_';
        return n;
    }();
    return name;
}

bool ProcessRuns(long pid) { return pid == getpid() || kill(static_cast<pid_t>(pid), 0) == 0 || errno == EPERM; }

} // namespace

bool ResolveOutputFile(const std::string &path, std::string &target, std::string &error) {
    struct stat st {};
    target = path;
    if (lstat(path.c_str(), &st) != 0) {
        if (errno == ENOENT) return true;
        error = path + ": " + std::strerror(errno);
        return false;
    }
    if (S_ISREG(st.st_mode)) return true;
    if (S_ISLNK(st.st_mode)) {
        std::error_code ec;
        const fs::path resolved = fs::canonical(path, ec);
        struct stat to {};
        if (ec || stat(resolved.c_str(), &to) != 0) {
            error = path + ": a symbolic link to nothing; refusing to write through it";
            return false;
        }
        if (!S_ISREG(to.st_mode)) {
            error = path + ": a symbolic link to " + FileKindName(to.st_mode) + " (" + resolved.string() +
                    "); refusing to write over it";
            return false;
        }
        target = resolved.string();
        return true;
    }
    error = path + ": " + FileKindName(st.st_mode) + ", not a regular file; refusing to write over it";
    return false;
}

std::string TemporaryFileFor(const std::string &target) {
    const fs::path p(target);
    return (p.parent_path() / ("." + p.filename().string() + kTempMark + HostName() + "-" + std::to_string(getpid())))
        .string();
}

bool ParseTemporaryName(const std::string &fileName, TemporaryName &parts) {
    const size_t mark = fileName.rfind(kTempMark);
    if (fileName.size() < 2 || fileName[0] != '.' || mark == std::string::npos || mark < 2) return false;
    const std::string rest = fileName.substr(mark + std::char_traits<char>::length(kTempMark));
    const size_t dash = rest.rfind('-');
    if (dash == std::string::npos || dash == 0 || dash + 1 == rest.size() || rest.size() - dash > 12) return false;
    for (size_t i = dash + 1; i < rest.size(); ++i)
        if (!std::isdigit(static_cast<unsigned char>(rest[i]))) return false;
    parts.target = fileName.substr(1, mark - 1);
    parts.host = rest.substr(0, dash);
    parts.pid = std::stol(rest.substr(dash + 1));
    return true;
}

int RemoveStaleTemporaries(const SequenceName &seq) {
    const fs::path folder = seq.folder.empty() ? "." : seq.folder;
    const std::string single = seq.prefix + seq.suffix;
    const auto now = fs::file_time_type::clock::now();
    int removed = 0;
    std::error_code ec;
    for (fs::directory_iterator it(folder, ec), end; !ec && it != end; it.increment(ec)) {
        TemporaryName parts;
        int64_t number;
        if (!ParseTemporaryName(it->path().filename().string(), parts)) continue;
        const bool ours = seq.hasNumber ? MatchesSequence(seq, parts.target, number) : parts.target == single;
        if (!ours || !it->is_regular_file(ec)) continue;
        const bool stale =
            parts.host == HostName() ? !ProcessRuns(parts.pid) : now - it->last_write_time(ec) > kForeignTempAge && !ec;
        if (stale && fs::remove(it->path(), ec)) ++removed;
    }
    return removed;
}

} // namespace Orvane
