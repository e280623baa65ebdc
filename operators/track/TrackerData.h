#pragma once
// TrackerData: one tracker of a Tracker tool (or of the tracker modifier):
// its inputs, numbered from 1 (Name<n>, Enabled<n>, Delete<n>, the label
// TrackerLabel<n>, Tracker<n>BestMatch, Tracker<n>Channel,
// Tracker<n>ShowChannel, PatternCenter<n>, PatternWidth<n>,
// PatternHeight<n>, SearchWidth<n>, SearchHeight<n>, the path
// TrackedCenter<n>, XOffset<n>, YOffset<n>), its outputs (Position<n> and the
// others), its matcher and what it learns during a run.
//
// A run: BeginRun forgets the last run's points; each frame's Step takes the
// pattern on the run's first frame and tracks it on every frame (the first
// included, where it is found where it was taken), judges the match with the
// adaptive gate (TrackerStep.h) and appends the point it keeps; WritePath
// turns the points into keys of TrackedCenter<n>.
//
// Offsets: with PathCenter "Pattern Center" the points are the positions of
// the pattern's centre. With "Track Center (Append)" and a path that has
// keys already, each point is moved by the path's value at the run's first
// frame minus the pattern's centre there, so that the run continues the path
// from where it stands (a pattern moved to another feature mid-shot appends
// to the path without a jump).
//
// Thread safety: inputs are made on the main thread; Step and the
// rectangles run on the tool's render thread under the tracker's lock (the
// matcher's); WritePath runs on the main thread after a run.
#include <atomic>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "host/track/TrackPoint.h"
#include "operators/track/MatchMove.h"
#include "operators/track/TrackerStep.h"

namespace Orvane {

class Image;
class Input;
class Operator;
class Output;
class RenderTask;
class Request;

class TrackerData {
public:
    /// Adds tracker `number`'s inputs to `tool` on page `page`, and its outputs (kept from an earlier tracker of
    /// that number when the tool has them).
    TrackerData(Operator *tool, int number, int page);
    ~TrackerData();

    int Number() const { return number_; }
    /// The tracker's inputs, in the order added.
    const std::vector<Input *> &AllInputs() const { return inputs_; }
    const std::vector<Output *> &AllOutputs() const { return outputs_; }
    Input *EnabledInput() const { return enabled_; }
    Input *DeleteInput() const { return delete_; }
    Input *NameInput() const { return name_; }
    Input *PathInput() const { return path_; }
    Input *PatternCenterInput() const { return patternCenter_; }
    /// The tracker's name (Name<n>), "Point <n>" by default.
    std::string DisplayName() const;
    bool IsEnabled(double time) const;

    // ---- a run ----
    /// Forgets the points and what was learnt of the match values; the next Step takes the pattern anew.
    void BeginRun();
    /// The pixels of a `width` x `height` frame the step at `time` reads (pattern or search area).
    ImgRectI NeededRect(const Request *req, int width, int height);
    /// One tracking step on `img` at `time`; false when nothing was tracked (no image, pattern outside it,
    /// nothing found). A point is appended unless the adaptive gate drops it.
    bool Step(const Request *req, const Image *img, double time, TrackSettings &settings);
    const std::vector<tracking::PathPoint> &Points() const { return points_; }
    const TrackResult &LastResult() const { return last_; }
    /// Writes the run's points as keys of TrackedCenter<n>: every `framesPerPoint` frames from `runStart` and
    /// the last; keys already there between the first and the last point go. The number of keys written.
    int WritePath(double runStart, int framesPerPoint);

    /// Shows the last step's match value in Tracker<n>BestMatch; main thread, between the frames of a run.
    void ShowLastMatch();

    /// Where the tracker is at `time`: its path plus (XOffset<n>, YOffset<n>); false when the path has no keys.
    bool PositionAt(const Request *req, double time, double &x, double &y) const;
    /// Where the tracker was at the reference for `time`; false when the path has no keys.
    bool ReferenceAt(const Request *req, const tracking::ReferenceMode &ref, double time, double &x, double &y) const;
    /// How much the tracker counts at `time`, 0..1: 1 from its path's first key to its last; where the path
    /// starts after `rangeStart` (ends before `rangeEnd`), rising from 0 over the `fadeFrames` frames before its
    /// first key (falling to 0 over those after its last), so a tracker that joins or leaves mid-shot eases in
    /// and out rather than jerking the result; 0 for a path without keys.
    double Weight(double time, double rangeStart, double rangeEnd, int fadeFrames) const;

    /// The outputs' values at the request's time (the defaults, the frame's centre, for a disabled tracker):
    /// TrackedCenter<n> plus (XOffset<n>, YOffset<n>); the steady and unsteady positions are 0.5 minus and plus the
    /// tracker's movement since the reference. The perspective positions are the position taken through
    /// `flatten` (frame fractions to frame fractions) where it is given and succeeds, else the position.
    void SetOutputs(Request *req, const tracking::ReferenceMode &ref,
                    const std::function<bool(double &, double &)> &flatten = {}) const;

private:
    struct Pattern {
        double x, y, width, height, searchWidth, searchHeight;
        int channel;
    };
    Pattern PatternAt(const Request *req, double time) const;

    Operator *tool_;
    int number_;
    Input *name_, *enabled_, *delete_, *label_, *bestMatch_, *channel_, *showChannel_;
    Input *patternCenter_, *patternWidth_, *patternHeight_, *searchWidth_, *searchHeight_;
    Input *path_, *xOffset_, *yOffset_;
    Output *position_, *perspective_, *positionX_, *positionY_, *perspectiveX_, *perspectiveY_;
    Output *steady_, *unsteady_;
    std::vector<Input *> inputs_;
    std::vector<Output *> outputs_;

    // What a run learns; under the matcher's lock.
    TrackPoint matcher_;
    tracking::RunStats stats_;
    double offsetX_ = 0.0, offsetY_ = 0.0;
    TrackResult last_;
    bool active_ = false; ///< the run has taken its pattern
    std::vector<tracking::PathPoint> points_;
};

/// The trackers of `trackers` that are enabled at `time`.
std::vector<TrackerData *> EnabledTrackers(const std::vector<TrackerData *> &trackers, double time);

/// CheckRequest of a tracking step at the image level: asks `image` for the union of the trackers' search areas.
void AskSearchAreas(Request *req, Input *image, const std::vector<TrackerData *> &trackers);

/// A run of `trackers` (enabled ones) from frame `from` to frame `to`: renders `out` of their tool at each frame
/// with ReqFlagTrackStep in `task`, until the last frame, an abort of the task or `stop`; then writes each tracker's
/// points into its path with `framesPerPoint`. The number of points tracked.
int TrackFrames(Output *out, const std::vector<TrackerData *> &trackers, double from, double to, RenderTask *task,
                int framesPerPoint, const std::atomic<bool> &stop);

} // namespace Orvane
