#include "host/core/Suggest.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace Orvane::suggest_test {
namespace {

// Distances worked out by hand: each counts the fewest inserted, deleted, replaced or swapped neighbouring characters,
// case aside, where no character is edited twice ("ca" to "abc" takes three, not two).
TEST(Suggest, NameDistanceCountsEditsIgnoringCase) {
    const struct {
        const char *a, *b;
        size_t distance;
    } cases[] = {
        {"", "", 0},          {"", "abc", 3},          {"Gain", "gAIN", 0},   {"Gain", "Gian", 1},
        {"Blur", "Blurr", 1}, {"Merge", "Mrge", 1},    {"Merge", "Marge", 1}, {"kitten", "sitting", 3},
        {"abcd", "badc", 2},  {"ca", "abc", 3},        {"flaw", "lawn", 2},   {"Saturday", "Sunday", 3},
        {"ab", "ba", 1},      {"Center", "Centre", 1}, {"Size", "Blend", 5},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(NameDistance(c.a, c.b), c.distance) << c.a << " / " << c.b;
        EXPECT_EQ(NameDistance(c.b, c.a), c.distance) << c.b << " / " << c.a;
    }
}

// A name within one edit in three characters (at least one) is offered; the closest wins, the first of equals.
TEST(Suggest, OnlyCloseNamesAreOffered) {
    const std::vector<std::string> names = {"Gain", "Rain", "Gamma", "Saturation", "Blend", "Ab"};
    std::string offered;
    for (const char *word :
         {"gIAN", "Xain", "gama", "Sturatin", "Satxrxtixn", "Sxturxtxox", "Blxnx", "Bxxnx", "Bnd", "Ac", "Xy", "Game"})
        offered += std::string(word) + ":" + ClosestName(word, names) + " ";
    EXPECT_EQ(offered, "gIAN:Gain Xain:Gain gama:Gamma Sturatin:Saturation Satxrxtixn:Saturation Sxturxtxox: "
                       "Blxnx:Blend Bxxnx: Bnd: Ac:Ab Xy: Game: ");
    EXPECT_EQ(ClosestName("Gain", {}), "");
}

} // namespace
} // namespace Orvane::suggest_test
