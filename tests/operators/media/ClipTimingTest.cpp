// Time-to-frame arithmetic of clips: holds, trims, loop, reverse, and the 2:3 cadences.
#include <gtest/gtest.h>

#include "operators/media/ClipTiming.h"

namespace Orvane {
namespace {

// A clip at frame 100 using file frames 2..5; each row sets holds, reverse and loop, and gives the file frame at times
// (-1: none).
TEST(ClipTiming, HoldsTrimsReverseAndLoop) {
    // Holds first and last, reverse, loop, and (time, file frame) pairs.
    const std::tuple<int, int, bool, bool, std::vector<std::pair<double, int64_t>>> rows[] = {
        // Holds of 2 and 1 make 7 frames; fields truncate toward the frame they lie in.
        {2, 1, false, false, {{99.5, -1}, {100, 2}, {102, 2}, {103, 3}, {103.5, 3}, {104, 4}, {106, 5}, {107, -1}}},
        // Reversal follows the holds: the head holds the last used frame.
        {2, 1, true, false, {{100, 5}, {102, 5}, {103, 4}, {104, 3}, {105, 2}, {106, 2}}},
        // A loop repeats after the end only, far away too (no slow walk); up to 0.00005 before the end the last frame
        // holds and no loop wraps.
        {0, 0, false, true, {{99, -1}, {100, 2}, {103, 5}, {104, 2}, {111, 5}, {4000103, 5}, {103.99994, 5}}},
        {0, 0, false, false, {{103.99994, 5}, {103.99996, -1}}},
    };
    for (const auto &[holdFirst, holdLast, reverse, loop, frames] : rows) {
        ClipPlacement c;
        c.start = 100, c.trimIn = 2, c.trimOut = 5, c.holdFirst = holdFirst, c.holdLast = holdLast;
        c.reverse = reverse, c.loop = loop;
        c.end = c.start + ElementLength(c) - 1;
        for (auto [t, frame] : frames) EXPECT_EQ(FileFrameAt(c, t).value_or(-1), frame) << t;
    }
    // A one-frame range looping holds that frame everywhere after the start.
    ClipPlacement one;
    one.start = one.end = 100, one.trimIn = one.trimOut = 2, one.loop = true;
    for (double t : {100.0, 101.0, 150.5}) EXPECT_EQ(FileFrameAt(one, t), 2) << t;
}

TEST(ClipTiming, ClipSearchFindsTheElementOrTheOneBeforeAGap) {
    std::vector<ClipPlacement> list(2);
    list[0].start = 0, list[0].end = 9, list[1].start = 20, list[1].end = 29;
    EXPECT_FALSE(FindClipAt(list, -1));
    // In the gap (15) the clip before it answers.
    for (auto [t, clip] : {std::pair{9.5, 0u}, {15.0, 0u}, {20.0, 1u}, {1e8, 1u}})
        EXPECT_EQ(FindClipAt(list, t), clip) << t;
    EXPECT_FALSE(FileFrameAt(list[0], 15)); // ... and gives nothing there without loop
}

// Standard 2:3 pull-down: film frames A B C D become video frames AA BB BC CD DD (first field, second field). The
// plan's first field comes from plan.frame, the second from frame + 1 when mixed.
TEST(ClipTiming, PullDownFollowsTheTwoThreeCadence) {
    const int fields[5][2] = {{0, 0}, {1, 1}, {1, 2}, {2, 3}, {3, 3}};
    for (int64_t v = 0; v < 15; ++v) {
        const PullPlan p = PlanPullFrame(ImportPullDown, 0, 0, v, 100);
        const int64_t cycle = v / 5 * 4;
        EXPECT_EQ(p.frame, fields[v % 5][0] + cycle) << v;
        EXPECT_EQ(p.frame + (p.mix ? 1 : 0), fields[v % 5][1] + cycle) << v;
        EXPECT_FALSE(p.doubleField);
    }
    // Starting at "BB" drops the first video frame; film frames count from the clip's first.
    for (int64_t v = 0; v < 8; ++v) {
        const PullPlan later = PlanPullFrame(ImportPullDown, 0, 1, v, 100);
        const PullPlan base = PlanPullFrame(ImportPullDown, 0, 0, v + 1, 100);
        EXPECT_EQ(later.frame, base.frame - 1) << v;
        EXPECT_EQ(later.mix, base.mix) << v;
    }
}

// Pull-up undoes it: film frame A is video 0, B video 1, C the fields of videos 2 and 3, D video 4, then every five
// video frames four film frames.
TEST(ClipTiming, PullUpRebuildsFilmFramesAndDoublesAtTheEdges) {
    const int video[4] = {0, 1, 2, 4};
    for (int64_t f = 0; f < 12; ++f) {
        const PullPlan p = PlanPullFrame(ImportPullUp, 0, 0, f, 100);
        EXPECT_EQ(p.frame, video[f % 4] + f / 4 * 5) << f;
        EXPECT_EQ(p.mix, f % 4 == 2) << f;
        EXPECT_FALSE(p.doubleField);
    }
    // A clip ending on the first half of a mixed pair: one field, doubled.
    const PullPlan last = PlanPullFrame(ImportPullUp, 0, 0, 2, 3);
    EXPECT_EQ(last.frame, 2);
    EXPECT_TRUE(last.mix && last.doubleField);
    // Advanced 2:3 (AA BB BC CC DD) has one mixed frame per cycle.
    int mixed = 0;
    for (int64_t f = 0; f < 4; ++f) mixed += PlanPullFrame(ImportPullUp, 1, 0, f, 100).mix;
    EXPECT_EQ(mixed, 0); // the advanced cadence rebuilds film frames from whole video frames
}

// Five video frames hold four film frames: a trim out at the last video frame of two cycles ends at film frame 7, which
// ends at video frame 9. Fields: PAL's first field of frame 3 is field 1 ((n - 1) & 1, n = 6), modes 3 and 4 order as 1
// and 2.
TEST(ClipTiming, TrimsConvertBetweenFilmAndVideoFramesAndFieldsFollowTheMode) {
    // Frame, mode, first frame, converted frame.
    const int trims[][4] = {{0, ImportPullUp, 0, 0},
                            {0, ImportPullDown, 0, 0},
                            {7, ImportNormal, 3, 7},
                            {9, ImportPullUp, 0, 7},
                            {7, ImportPullDown, 0, 9}};
    for (auto [frame, mode, first, want] : trims)
        EXPECT_EQ(ConvertPullFrame(frame, mode, 0, first), want) << frame << " mode " << mode;
    EXPECT_EQ(FieldForTime(0, 3.5, 0.5), -1);
    const int fields[4][2] = {{1, 0}, {0, 1}, {1, 0}, {0, 1}}; // modes 1 to 4 at times 3 and 3.5
    for (int mode = 1; mode <= 4; ++mode)
        for (int half = 0; half < 2; ++half)
            EXPECT_EQ(FieldForTime(mode, 3 + half / 2.0, 0.5), fields[mode - 1][half]) << mode << " " << half;
}

} // namespace
} // namespace Orvane
