// Time-to-frame arithmetic of clips: holds, trims, loop, reverse, and the
// 2:3 cadences checked against the film frames each video field shows.
#include <gtest/gtest.h>

#include "operators/media/ClipTiming.h"

namespace Orvane {
namespace {

ClipPlacement Clip10(double start = 100) {
    ClipPlacement c;
    c.start = start;
    c.trimIn = 2;
    c.trimOut = 5; // file frames 2..5 used
    c.end = start + 3;
    return c;
}

TEST(ClipTiming, HoldsTrimsAndReverse) {
    ClipPlacement c = Clip10();
    c.holdFirst = 2;
    c.holdLast = 1;
    c.end = c.start + ElementLength(c) - 1; // 2 + 4 + 1 = 7 frames
    ASSERT_EQ(ElementLength(c), 7);
    const int64_t forward[] = {2, 2, 2, 3, 4, 5, 5};
    for (int i = 0; i < 7; ++i) EXPECT_EQ(FileFrameAt(c, 100 + i), forward[i]) << i;
    // Reversal follows the holds: the head holds the last used frame.
    c.reverse = true;
    const int64_t backward[] = {5, 5, 5, 4, 3, 2, 2};
    for (int i = 0; i < 7; ++i) EXPECT_EQ(FileFrameAt(c, 100 + i), backward[i]) << i;
    // Fractional times (fields) truncate toward the frame they lie in.
    c.reverse = false;
    EXPECT_EQ(FileFrameAt(c, 103.5), 3);
    EXPECT_FALSE(FileFrameAt(c, 99.5));
    EXPECT_FALSE(FileFrameAt(c, 107));
}

TEST(ClipTiming, LoopRepeatsAfterTheEndOnly) {
    ClipPlacement c = Clip10();
    c.loop = true;
    for (int i = 0; i < 12; ++i) EXPECT_EQ(FileFrameAt(c, 100 + i), 2 + i % 4) << i;
    EXPECT_EQ(FileFrameAt(c, 100 + 4000003), 5); // far away, no slow walk
    EXPECT_FALSE(FileFrameAt(c, 99));            // before the start nothing, loop or not
    // Up to 0.00005 before the end the last frame holds, and a loop does not wrap yet.
    EXPECT_EQ(FileFrameAt(c, 103.99994), 5);
    EXPECT_EQ(FileFrameAt(c, 104), 2);
    c.loop = false;
    EXPECT_EQ(FileFrameAt(c, 103.99994), 5);
    EXPECT_FALSE(FileFrameAt(c, 103.99996));
    c.loop = true;
    // A one-frame range looping holds that frame everywhere after the start.
    c.trimOut = c.trimIn;
    c.end = c.start;
    for (double t : {100.0, 101.0, 150.5}) EXPECT_EQ(FileFrameAt(c, t), 2) << t;
}

TEST(ClipTiming, ClipSearchFindsTheElementOrTheOneBeforeAGap) {
    std::vector<ClipPlacement> list(2);
    list[0].start = 0;
    list[0].end = 9;
    list[1].start = 20;
    list[1].end = 29;
    EXPECT_FALSE(FindClipAt(list, -1));
    EXPECT_EQ(FindClipAt(list, 9.5), 0u);
    EXPECT_EQ(FindClipAt(list, 15), 0u); // in the gap: the clip before it answers
    EXPECT_EQ(FindClipAt(list, 20), 1u);
    EXPECT_EQ(FindClipAt(list, 1e8), 1u);
    EXPECT_FALSE(FileFrameAt(list[0], 15)); // ... and gives nothing there without loop
}

// Standard 2:3 pull-down: film frames A B C D become video frames AA BB BC CD DD
// (first field, second field). The plan's first field comes from plan.frame, the
// second from frame + 1 when mixed.
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

// Pull-up undoes it: film frame A is video 0, B video 1, C the fields of videos 2
// and 3, D video 4, then every five video frames four film frames.
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

TEST(ClipTiming, TrimsConvertBetweenFilmAndVideoFrames) {
    // Five video frames hold four film frames: the conversions of the cadence start.
    EXPECT_EQ(ConvertPullFrame(0, ImportPullUp, 0, 0), 0);
    EXPECT_EQ(ConvertPullFrame(0, ImportPullDown, 0, 0), 0);
    EXPECT_EQ(ConvertPullFrame(7, ImportNormal, 0, 3), 7);
    // A trim out at the last video frame of two cycles ends at film frame 7.
    EXPECT_EQ(ConvertPullFrame(9, ImportPullUp, 0, 0), 7);
    // Film frame 7 ends at video frame 9.
    EXPECT_EQ(ConvertPullFrame(7, ImportPullDown, 0, 0), 9);
}

TEST(ClipTiming, FieldOrderByProcessMode) {
    EXPECT_EQ(FieldForTime(0, 3.5, 0.5), -1);
    // PAL: the first field of frame 3 is field 1 ((n - 1) & 1 with n = 6).
    EXPECT_EQ(FieldForTime(1, 3.0, 0.5), 1);
    EXPECT_EQ(FieldForTime(1, 3.5, 0.5), 0);
    EXPECT_EQ(FieldForTime(2, 3.0, 0.5), 0);
    EXPECT_EQ(FieldForTime(2, 3.5, 0.5), 1);
    EXPECT_EQ(FieldForTime(3, 3.0, 0.5), FieldForTime(1, 3.0, 0.5));
    EXPECT_EQ(FieldForTime(4, 3.0, 0.5), FieldForTime(2, 3.0, 0.5));
}

} // namespace
} // namespace Orvane
