// Frame lists and chunks of render commands.
#include <gtest/gtest.h>

#include <numeric>

#include "host/app/FrameSpec.h"

namespace Orvane::framespectest {
namespace {

using Frames = std::vector<int64_t>;

TEST(FrameSpec, TheGrammarAsOneTable) {
    const struct {
        const char *text;
        Frames frames;
    } cases[] = {
        {"7", {7}},
        {"1-5", {1, 2, 3, 4, 5}},
        {"1-10x3", {1, 4, 7, 10}},
        {"1-9x4", {1, 5, 9}},
        {"1-8x4", {1, 5}},
        {"5-1", {5, 4, 3, 2, 1}},
        {"10-1x4", {10, 6, 2}},
        {"-3-1", {-3, -2, -1, 0, 1}},
        {"0", {0}},
        {"-23--20", {-23, -22, -21, -20}},
        {"-5--8", {-5, -6, -7, -8}},
        {"1,5,10-12", {1, 5, 10, 11, 12}},
        {"1001-1003", {1001, 1002, 1003}},
        {"3,1-4,2", {3, 1, 2, 4}}, // a frame named twice renders once, where it first appears
    };
    for (const auto &c : cases) {
        Frames frames;
        std::string error;
        EXPECT_TRUE(ParseFrameSpec(c.text, frames, error)) << c.text << ": " << error;
        EXPECT_EQ(frames, c.frames) << c.text;
    }
    for (const char *bad :
         {"", "a", "1-", "1-5x", "1-5x0", "1-5x-2", "1,,2", "1,", "1;2", "1-5 ", " 1", "1--", "1x2", "1-99999999999"}) {
        Frames frames{42};
        std::string error;
        EXPECT_FALSE(ParseFrameSpec(bad, frames, error)) << bad;
        EXPECT_TRUE(frames.empty()) << bad;
        EXPECT_NE(error.find("bad frame list"), std::string::npos) << bad;
    }
    EXPECT_EQ(FrameRange(5, 3), (Frames{5, 4, 3}));
    EXPECT_EQ(FrameRange(-1, -1), (Frames{-1}));
}

TEST(FrameSpec, ChunksCoverTheListOnceInOrder) {
    for (int n : {1, 2, 3, 7, 10, 11})
        for (int chunks : {1, 2, 3, 4, 12}) {
            Frames all(n), joined;
            std::iota(all.begin(), all.end(), 100);
            size_t largest = 0, smallest = SIZE_MAX;
            for (int i = 1; i <= chunks; ++i) {
                Frames part = all;
                std::string error;
                ASSERT_TRUE(TakeChunk(std::to_string(i) + "/" + std::to_string(chunks), part, error)) << error;
                largest = std::max(largest, part.size()), smallest = std::min(smallest, part.size());
                joined.insert(joined.end(), part.begin(), part.end());
            }
            EXPECT_EQ(joined, all) << n << " frames in " << chunks << " chunks";
            EXPECT_LE(largest - smallest, 1u) << "chunks are equal to within one frame";
        }
    Frames ten{1, 2, 3, 4, 5, 6, 7, 8, 9, 10};
    std::string error;
    ASSERT_TRUE(TakeChunk("2/3", ten, error));
    EXPECT_EQ(ten, (Frames{5, 6, 7}));
    for (const char *bad : {"0/3", "4/3", "1/0", "3", "a/b", "1/2/3", "-1/2"}) {
        Frames f{1, 2};
        EXPECT_FALSE(TakeChunk(bad, f, error)) << bad;
    }
}

} // namespace
} // namespace Orvane::framespectest
