#include "host/core/Suggest.h"

#include <algorithm>
#include <cctype>

namespace Orvane {

size_t NameDistance(std::string_view a, std::string_view b) {
    auto same = [](char x, char y) {
        return std::tolower(static_cast<unsigned char>(x)) == std::tolower(static_cast<unsigned char>(y));
    };
    // Three rows of the edit table: two back (for swaps), the last, this one.
    std::vector<size_t> older(b.size() + 1), last(b.size() + 1), row(b.size() + 1);
    for (size_t j = 0; j <= b.size(); ++j) last[j] = j;
    for (size_t i = 1; i <= a.size(); ++i) {
        row[0] = i;
        for (size_t j = 1; j <= b.size(); ++j) {
            const size_t cost = same(a[i - 1], b[j - 1]) ? 0 : 1;
            row[j] = std::min({last[j] + 1, row[j - 1] + 1, last[j - 1] + cost});
            if (i > 1 && j > 1 && same(a[i - 1], b[j - 2]) && same(a[i - 2], b[j - 1]))
                row[j] = std::min(row[j], older[j - 2] + 1);
        }
        std::swap(older, last);
        std::swap(last, row);
    }
    return last[b.size()];
}

std::string ClosestName(std::string_view word, const std::vector<std::string> &candidates) {
    const size_t allowed = std::max<size_t>(1, (word.size() + 1) / 3);
    size_t best = allowed + 1;
    std::string found;
    for (const std::string &c : candidates) {
        const size_t d = NameDistance(word, c);
        if (d < best) {
            best = d;
            found = c;
        }
    }
    return found;
}

std::string DidYouMean(std::string_view word, const std::vector<std::string> &candidates) {
    const std::string found = ClosestName(word, candidates);
    return found.empty() ? std::string() : " (did you mean '" + found + "'?)";
}

} // namespace Orvane
