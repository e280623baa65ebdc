#include "operators/media/ClipTiming.h"

#include <algorithm>
#include <cmath>

namespace Orvane {

namespace cadence {
const int PullupStart[2][5] = {{0, 1, 1, 2, 3}, {0, 1, 1, 2, 3}};
const int PullupFrame[2][4] = {{0, 1, 2, 4}, {0, 1, 3, 4}};
const int PullupMixed[2][5] = {{0, 0, 1, 1, 0}, {0, 0, 1, 0, 0}};
const int PulldownStart[2][5] = {{0, 1, 1, 2, 3}, {0, 1, 1, 2, 3}};
const int PulldownFrame[2][5] = {{0, 1, 1, 2, 3}, {0, 1, 1, 2, 3}};
const int PulldownMixed[2][5] = {{0, 0, 1, 1, 0}, {0, 0, 1, 0, 0}};
const int TrimFilmStart[2][5] = {{0, 1, 2, 3, 3}, {0, 1, 2, 2, 3}};
const int TrimFilmFirst[2][5] = {{0, 1, 2, 3, 3}, {0, 1, 2, 2, 3}};
const int TrimFilmLast[2][5] = {{0, 1, 1, 2, 3}, {0, 1, 1, 2, 3}};
const int TrimVideoFirst[2][4] = {{0, 1, 2, 4}, {0, 1, 3, 4}};
const int TrimVideoLast[2][4] = {{0, 1, 3, 4}, {0, 1, 3, 4}};
} // namespace cadence

namespace {
int Row(int pullType) { return std::clamp(pullType, 0, 1); }
int Column(int pullFirst) { return std::clamp(pullFirst, 0, 4); }
} // namespace

int ConvertPullFrame(int v, int importMode, int pullType, int pullFirst) {
    using namespace cadence;
    const int r = Row(pullType), c = Column(pullFirst);
    if (importMode == ImportPullUp) {
        const int u = v + c, q = u / 5, m = u - 5 * q, b = TrimFilmStart[r][c];
        const int first = TrimFilmFirst[r][m] - b + 4 * q;
        if (v == 0) return first;
        return first - (TrimFilmLast[r][c % 5] + 4 * (c / 5) - b);
    }
    if (importMode == ImportPullDown) {
        const int b = TrimFilmStart[r][c], u = b + v;
        const int w = TrimVideoFirst[r][u % 4] + 5 * (u / 4);
        if (v == 0) return w - c;
        return w - 5 * (b / 4) - TrimVideoLast[r][b % 4];
    }
    return v;
}

std::optional<int64_t> FileFrameAt(const ClipPlacement &clip, double t) {
    const double g0 = clip.start, g1 = std::max(clip.start, clip.end);
    int tin = clip.trimIn, tout = std::max(clip.trimIn, clip.trimOut);
    // A time within the last 0.00005 of the final frame still belongs to it.
    const double limit = g1 + 1 - 5e-5;
    if (clip.loop && t > limit) {
        const double period = g1 - g0 + 1;
        t -= std::ceil((t - limit) / period) * period;
        while (t > limit) t -= period; // rounding of the division
    }
    if (t < g0 || t > limit) return std::nullopt;
    if (clip.importMode != ImportNormal) {
        tin = ConvertPullFrame(tin, clip.importMode, clip.pullType, clip.pullFirst);
        tout = std::max(tin, ConvertPullFrame(tout, clip.importMode, clip.pullType, clip.pullFirst));
    }
    double f = t - g0 - clip.holdFirst + tin;
    f = std::clamp(f, static_cast<double>(tin), static_cast<double>(tout));
    if (clip.reverse) f = tout - (f - tin);
    return static_cast<int64_t>(std::trunc(f));
}

PullPlan PlanPullFrame(int importMode, int pullType, int pullFirst, int64_t f, int64_t length) {
    using namespace cadence;
    const int r = Row(pullType), c = Column(pullFirst);
    PullPlan plan;
    if (importMode == ImportPullUp) {
        const int64_t u = PullupStart[r][c] + f;
        const int64_t q = u >= 0 ? u / 4 : -((-u + 3) / 4);
        const int m = static_cast<int>(u - 4 * q);
        const int k = PullupFrame[r][m];
        plan.frame = 5 * q - c + k;
        plan.mix = PullupMixed[r][k] != 0;
        plan.dominance = 1;
        if (plan.frame == -1) {
            // The cadence starts inside a mixed frame: its first half is missing.
            plan.frame = 0;
            plan.dominance = 0;
            plan.doubleField = true;
        } else if (plan.frame == length && PullupMixed[r][(k + 4) % 5]) {
            // Past the end: the last frame's lone field.
            plan.frame -= 1;
            plan.mix = true;
            plan.doubleField = true;
        } else if (plan.frame == length - 1 && plan.mix) {
            // A mixed frame whose partner lies beyond the clip.
            plan.doubleField = true;
        }
        return plan;
    }
    const int64_t u = c + f;
    const int64_t q = u / 5;
    const int m = static_cast<int>(u - 5 * q);
    plan.frame = 4 * q - PulldownStart[r][c] + PulldownFrame[r][m];
    plan.mix = PulldownMixed[r][m] != 0;
    plan.dominance = 0;
    return plan;
}

int FieldForTime(int processMode, double time, double fieldStep) {
    if (processMode <= 0 || fieldStep <= 0) return -1;
    const long long n = static_cast<long long>(time / fieldStep + 0.5);
    if (processMode == 1 || processMode == 3) return static_cast<int>((n - 1) & 1);
    return static_cast<int>(n & 1);
}

std::optional<size_t> FindClipAt(const std::vector<ClipPlacement> &clips, double t) {
    std::optional<size_t> before;
    for (size_t i = 0; i < clips.size() && clips[i].start <= t; ++i) before = i;
    return before;
}

} // namespace Orvane
