#pragma once
// The arithmetic of one tracking step and of turning a run's points into path
// keys, kept apart from the tool so that it can be checked on its own.
//
// A run judges each match value (0 perfect, larger worse) against the mean
// of the values it has counted so far: f = count * match / sum. With an
// adaptive mode on, a step whose f exceeds 1 / adaptiveLow is dropped (its
// point is not appended): a match that much worse than the run's mean is
// taken for a lost pattern. A first step (count 0) always passes; a run
// whose counted values sum to nothing positive gives f = 100. Values at or
// below kMatchFloor (single-precision epsilon) are perfect matches and are
// not counted, so they cannot make the mean zero.
//
// Path keys: a run's points become keys of the tracker's path at every
// framesPerPoint-th frame counted from the run's first frame, and at its
// last, so the path ends where the run ended.
//
// Thread safety: plain functions and values.
#include <algorithm>
#include <cmath>
#include <vector>

#include "host/track/TrackPoint.h"

namespace Orvane::tracking {

/// Match values at or below this count as perfect: they are not added to a run's sum.
constexpr double kMatchFloor = 1.1920928955078125e-7;

/// What a tracker learns of its match values over one run.
struct RunStats {
    float sum = 0.0f; ///< counted match values
    int count = 0;    ///< how many were counted
};

/// One point of a run: where the tracker was (with its offset) at `time`.
struct PathPoint {
    double x = 0.0, y = 0.0, time = 0.0;
};

/// f of the section above: 0 before anything is counted, 100 when the sum is not positive.
inline double AdaptiveFactor(const RunStats &stats, double match) {
    if (stats.count <= 0) return 0.0;
    if (!(stats.sum > 0.0f)) return 100.0;
    return stats.count * match / stats.sum;
}

/// Whether a step with `match` keeps its point: always with the mode off (adaptiveLow 0).
inline bool PassesGate(const RunStats &stats, double match, float adaptiveLow) {
    if (!(adaptiveLow > 0.0f)) return true;
    return !(AdaptiveFactor(stats, match) > 1.0 / adaptiveLow);
}

/// Counts a kept step's match value when it is above the floor.
inline void CountMatch(RunStats &stats, double match) {
    if (match > kMatchFloor) {
        stats.sum += static_cast<float>(match);
        stats.count += 1;
    }
}

/// The whole judgement of one step: appends (x + offset, y + offset, time) and counts the match value
/// unless the gate drops it. True when the point was appended.
inline bool TakeStep(RunStats &stats, std::vector<PathPoint> &points, double x, double y, double match, double offsetX,
                     double offsetY, double time, float adaptiveLow) {
    if (!PassesGate(stats, match, adaptiveLow)) return false;
    CountMatch(stats, match);
    points.push_back({x + offsetX, y + offsetY, time});
    return true;
}

/// The settings one request tracks with, from the tool's values.
inline TrackSettings MakeSettings(bool tracking, double matchTolerance, int adaptiveMode, double pathCenter,
                                  double framesPerPoint) {
    TrackSettings s;
    s.tracking = tracking;
    s.matchTolerance = static_cast<float>(matchTolerance);
    s.adaptiveLow = adaptiveMode != 0 ? 0.3f : 0.0f;
    s.adaptiveHigh = adaptiveMode != 0 ? 0.8f : 0.0f;
    s.pathCenter = pathCenter >= 0.5;
    s.framesPerPoint = std::max(1, static_cast<int>(std::lround(framesPerPoint)));
    s.adaptive = adaptiveMode == 1   ? TrackSettings::Adaptive::EveryFrame
                 : adaptiveMode == 2 ? TrackSettings::Adaptive::BestMatch
                                     : TrackSettings::Adaptive::None;
    return s;
}

/// The points of a run that become path keys: those every `framesPerPoint` frames from `runStart`
/// (either way in time) and the last point of the run. Points keep their order.
inline std::vector<PathPoint> KeyPoints(const std::vector<PathPoint> &points, double runStart, int framesPerPoint) {
    std::vector<PathPoint> keys;
    const int every = std::max(1, framesPerPoint);
    for (size_t i = 0; i < points.size(); ++i) {
        const long frames = std::lround(std::fabs(points[i].time - runStart));
        if (frames % every == 0 || i + 1 == points.size()) keys.push_back(points[i]);
    }
    return keys;
}

} // namespace Orvane::tracking
