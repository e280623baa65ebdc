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

/// The last frame-number marker in `name` ("####", "%04d", "%d", "$F4",
/// "$F"): [begin, end) and its padding. False when there is none.
bool FindMarker(const std::string &name, size_t &begin, size_t &end, int &padding) {
    bool found = false;
    auto take = [&](size_t b, size_t e, int p) {
        begin = b, end = e, padding = p;
        found = true;
    };
    for (size_t i = 0; i < name.size(); ++i) {
        if (name[i] == '#') {
            size_t j = i;
            while (j < name.size() && name[j] == '#') ++j;
            take(i, j, static_cast<int>(j - i));
            i = j - 1;
        } else if (name[i] == '%') {
            size_t j = i + 1;
            while (j < name.size() && IsDigit(name[j]) && j - i <= 2) ++j;
            if (j < name.size() && name[j] == 'd')
                take(i, j + 1, j > i + 1 ? std::max(1, std::stoi(name.substr(i + 1, j - i - 1))) : 1);
        } else if (name.compare(i, 2, "$F") == 0) {
            const bool digit = i + 2 < name.size() && IsDigit(name[i + 2]) && name[i + 2] != '0';
            take(i, i + (digit ? 3 : 2), digit ? name[i + 2] - '0' : 1);
        }
    }
    return found;
}

} // namespace

SequenceName ParseSequenceName(const std::string &path) {
    SequenceName seq;
    const size_t slash = path.find_last_of('/');
    seq.folder = slash == std::string::npos ? "" : path.substr(0, slash + 1);
    const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
    size_t begin, end, sign;
    int padding;
    if (FindMarker(name, begin, end, padding)) {
        seq.hasNumber = true;
        seq.prefix = name.substr(0, begin);
        seq.suffix = name.substr(end);
        seq.padding = padding;
        return seq;
    }
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

SequenceName OutputSequenceName(const std::string &path, bool severalFrames) {
    SequenceName seq = ParseSequenceName(path);
    if (seq.hasNumber || !severalFrames) return seq;
    const std::string name = seq.prefix;
    const size_t ext = ExtensionStart(name);
    const std::string stem = name.substr(0, ext);
    const bool joined = !stem.empty() && (stem.back() == '.' || stem.back() == '_');
    seq.prefix = stem + (joined ? "" : ".");
    seq.suffix = name.substr(ext);
    seq.padding = 4;
    seq.hasNumber = true;
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
    const size_t fixed = seq.prefix.size() + seq.suffix.size();
    if (!seq.hasNumber || fileName.size() <= fixed || fileName.compare(0, seq.prefix.size(), seq.prefix) != 0 ||
        fileName.compare(fileName.size() - seq.suffix.size(), seq.suffix.size(), seq.suffix) != 0)
        return false;
    std::string digits = fileName.substr(seq.prefix.size(), fileName.size() - fixed);
    // A minus sign follows '.', '_' or the start of the name (see ParseSequenceName).
    const char before = seq.prefix.empty() ? '.' : seq.prefix.back();
    const bool negative = digits[0] == '-' && (before == '.' || before == '_');
    if (negative) digits.erase(0, 1);
    if (digits.empty() || digits.size() > 18 || !std::all_of(digits.begin(), digits.end(), IsDigit)) return false;
    const int padding = static_cast<int>(digits.size());
    const bool leadingZero = digits.size() > 1 && digits[0] == '0';
    const bool fits =
        seq.padding <= 1 ? !leadingZero : padding == seq.padding || (padding > seq.padding && !leadingZero);
    if (!fits) return false;
    number = negative ? -std::stoll(digits) : std::stoll(digits);
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
