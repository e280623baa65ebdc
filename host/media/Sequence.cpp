#include "host/media/Sequence.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <system_error>

namespace Orvane {
namespace {

bool IsDigit(char c) { return std::isdigit(static_cast<unsigned char>(c)) != 0; }

/// Index of the extension's dot in a file name, or its length.
size_t ExtensionStart(const std::string &name) {
    const size_t dot = name.rfind('.');
    return dot == std::string::npos || dot == 0 ? name.size() : dot;
}

/// Finds the number run in `name`: [digitsBegin, digitsEnd), the sign's index
/// (or npos). False when there is no number.
bool FindNumber(const std::string &name, size_t &digitsBegin, size_t &digitsEnd, size_t &sign) {
    size_t end = ExtensionStart(name);
    while (end > 0 && !IsDigit(name[end - 1])) --end;
    if (end == 0) return false;
    size_t begin = end;
    while (begin > 0 && IsDigit(name[begin - 1])) --begin;
    sign = std::string::npos;
    if (begin > 0 && name[begin - 1] == '-' && (begin == 1 || name[begin - 2] == '.' || name[begin - 2] == '_'))
        sign = begin - 1;
    digitsBegin = begin;
    digitsEnd = end;
    return end - begin <= 18; // beyond that it is no frame number
}

} // namespace

SequenceName ParseSequenceName(const std::string &path) {
    SequenceName seq;
    const size_t slash = path.find_last_of('/');
    seq.folder = slash == std::string::npos ? "" : path.substr(0, slash + 1);
    const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
    // The display form "shot.####.exr" names the sequence with its padding.
    if (const size_t hashEnd = name.find_last_of('#'); hashEnd != std::string::npos) {
        const size_t hashBegin = name.find_last_not_of('#', hashEnd);
        const size_t first = hashBegin == std::string::npos ? 0 : hashBegin + 1;
        seq.hasNumber = true;
        seq.prefix = name.substr(0, first);
        seq.suffix = name.substr(hashEnd + 1);
        seq.padding = static_cast<int>(hashEnd + 1 - first);
        return seq;
    }
    size_t begin, end, sign;
    if (!FindNumber(name, begin, end, sign)) {
        seq.prefix = name;
        return seq;
    }
    seq.hasNumber = true;
    seq.prefix = name.substr(0, sign == std::string::npos ? begin : sign);
    seq.suffix = name.substr(end);
    seq.padding = static_cast<int>(end - begin);
    seq.number = std::stoll(name.substr(begin, end - begin));
    if (sign != std::string::npos) seq.number = -seq.number;
    return seq;
}

std::string SequencePath(const SequenceName &seq, int64_t number) {
    if (!seq.hasNumber) return seq.folder + seq.prefix + seq.suffix;
    std::string digits = std::to_string(number < 0 ? -number : number);
    if (static_cast<int>(digits.size()) < seq.padding) digits.insert(0, seq.padding - digits.size(), '0');
    return seq.folder + seq.prefix + (number < 0 ? "-" : "") + digits + seq.suffix;
}

std::string SequenceDisplayName(const SequenceName &seq) {
    if (!seq.hasNumber) return seq.folder + seq.prefix + seq.suffix;
    return seq.folder + seq.prefix + std::string(static_cast<size_t>(std::max(seq.padding, 1)), '#') + seq.suffix;
}

bool MatchesSequence(const SequenceName &seq, const std::string &fileName, int64_t &number) {
    if (!seq.hasNumber) return false;
    const SequenceName other = ParseSequenceName(fileName);
    if (!other.hasNumber || other.prefix != seq.prefix || other.suffix != seq.suffix) return false;
    const std::string digits = std::to_string(other.number < 0 ? -other.number : other.number);
    const bool leadingZero = static_cast<int>(digits.size()) < other.padding;
    const bool fits =
        seq.padding <= 1 ? !leadingZero : other.padding == seq.padding || (other.padding > seq.padding && !leadingZero);
    if (!fits) return false;
    number = other.number;
    return true;
}

SequenceScan ScanSequence(const SequenceName &seq) {
    SequenceScan scan;
    if (!seq.hasNumber) return scan;
    std::error_code ec;
    const std::filesystem::path folder = seq.folder.empty() ? "." : seq.folder;
    for (std::filesystem::directory_iterator it(folder, ec), end; !ec && it != end; it.increment(ec)) {
        int64_t number;
        if (it->is_regular_file(ec) && MatchesSequence(seq, it->path().filename().string(), number))
            scan.frames.push_back(number);
    }
    std::sort(scan.frames.begin(), scan.frames.end());
    scan.frames.erase(std::unique(scan.frames.begin(), scan.frames.end()), scan.frames.end());
    for (size_t i = 1; i < scan.frames.size(); ++i)
        if (scan.frames[i] > scan.frames[i - 1] + 1) scan.gaps.emplace_back(scan.frames[i - 1] + 1, scan.frames[i] - 1);
    return scan;
}

} // namespace Orvane
