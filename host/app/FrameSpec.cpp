#include "host/app/FrameSpec.h"

#include <cctype>
#include <unordered_set>

#include "host/flow/OrvaneDoc.h"

namespace Orvane {
namespace {

/// Largest number of frames one list may name: guards against "1-1e18".
constexpr int64_t MaxFrames = MaxFramesInRange;

bool ReadNumber(const std::string &s, size_t &at, int64_t &value) {
    const size_t start = at;
    if (at < s.size() && s[at] == '-') ++at;
    const size_t digits = at;
    while (at < s.size() && std::isdigit(static_cast<unsigned char>(s[at]))) ++at;
    if (at == digits || at - digits > 15) {
        at = start;
        return false;
    }
    value = std::stoll(s.substr(start, at - start));
    return true;
}

} // namespace

std::vector<int64_t> FrameRange(int64_t first, int64_t last) {
    std::vector<int64_t> frames;
    const int64_t step = first <= last ? 1 : -1;
    for (int64_t f = first;; f += step) {
        frames.push_back(f);
        if (f == last) break;
    }
    return frames;
}

bool ParseFrameSpec(const std::string &text, std::vector<int64_t> &frames, std::string &error) {
    frames.clear();
    std::unordered_set<int64_t> seen;
    auto fail = [&](const std::string &why) {
        error = "bad frame list '" + text + "': " + why;
        frames.clear();
        return false;
    };
    if (text.empty()) return fail("it is empty");
    size_t at = 0;
    int64_t total = 0;
    while (true) {
        int64_t first, last, step = 1;
        if (!ReadNumber(text, at, first)) return fail("expected a frame number at position " + std::to_string(at + 1));
        last = first;
        if (at < text.size() && text[at] == '-') {
            ++at;
            if (!ReadNumber(text, at, last))
                return fail("expected the last frame at position " + std::to_string(at + 1));
            if (at < text.size() && text[at] == 'x') {
                ++at;
                if (!ReadNumber(text, at, step) || step < 1)
                    return fail("expected a step of 1 or more at position " + std::to_string(at + 1));
            }
        }
        const int64_t count = (first <= last ? last - first : first - last) / step + 1;
        total += count;
        if (total > MaxFrames) return fail("it names more than " + std::to_string(MaxFrames) + " frames");
        const int64_t dir = first <= last ? step : -step;
        for (int64_t i = 0, f = first; i < count; ++i, f += dir)
            if (seen.insert(f).second) frames.push_back(f);
        if (at == text.size()) break;
        if (text[at] != ',')
            return fail(std::string("unexpected '") + text[at] + "' at position " + std::to_string(at + 1));
        ++at;
    }
    return true;
}

bool TakeChunk(const std::string &chunk, std::vector<int64_t> &frames, std::string &error) {
    size_t at = 0;
    int64_t index, count;
    if (!ReadNumber(chunk, at, index) || at >= chunk.size() || chunk[at] != '/') {
        error = "bad chunk '" + chunk + "': expected I/N";
        return false;
    }
    ++at;
    if (!ReadNumber(chunk, at, count) || at != chunk.size() || count < 1 || index < 1 || index > count) {
        error = "bad chunk '" + chunk + "': expected I/N with 1 <= I <= N";
        return false;
    }
    const int64_t n = static_cast<int64_t>(frames.size());
    const int64_t base = n / count, extra = n % count;
    const int64_t begin = (index - 1) * base + std::min(index - 1, extra);
    const int64_t length = base + (index - 1 < extra ? 1 : 0);
    frames = std::vector<int64_t>(frames.begin() + begin, frames.begin() + begin + length);
    return true;
}

} // namespace Orvane
