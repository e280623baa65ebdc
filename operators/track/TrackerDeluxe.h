#pragma once
// TrackerDeluxe, the Tracker tool: any number of trackers (TrackerData) that
// follow patterns of the Input image over time into paths, and the use of
// those paths on the image (Operation).
//
// Trackers: the hidden input TrackerList is the table of tracker numbers
// ({ 1 } in a new tool); setting it makes and removes trackers, so a
// document's list brings its trackers back before their values are read.
// Delete<n> takes tracker n out of the list.
//
// Runs: CCMD_Track (ControlCommand.h) steps every enabled tracker frame by
// frame from one frame to another, rendering the tool at each frame with
// ReqFlagTrackStep: CheckRequest narrows the Input to the trackers' search
// areas, Process has each tracker step on the image. After the last frame,
// or when the render is stopped, each tracker's points become keys of its
// TrackedCenter<n> path. The track buttons run the same from the time they
// are pressed at to the end or the start of the render range (one frame for
// the one-frame buttons); with no tracker enabled they and CCMD_Track write
// "No trackers are selected." and do nothing.
//
// Operation: "None" gives the Input unchanged. "Match Move" takes the
// trackers' motion since their reference (MatchMove.h) as one Transform
// step: "BG only" steadies the Input (the shot held at its reference), "FG
// only" moves the Foreground with the shot, "FG over BG" lays the moving
// Foreground over the Input and "BG over FG" the Input over it, through the
// merge controls; each image is resampled once.
//
// "Corner Positioning" pins the Foreground's frame corners onto the first
// four enabled trackers' positions at the request's time (the Foreground
// moves onto the plate); "Perspective Positioning" maps those four points of
// the Input back to the frame's corners (the plate is un-warped). Trackers
// 1..4 of that choice are the bottom-left, bottom-right, top-right and
// top-left corners; each Rotate Clockwise press turns the picture a quarter
// clockwise on its corners (the hidden CornerTurns counts the turns).
// MappingType "Perspective" maps through the homography of the four pairs,
// "Bi-Linear" through the bilinear quad map (QuadMap.h). The warped layer is
// resampled once, through its pending transform and the quad map together,
// then merged as Match Move merges: in Corner Positioning the warped
// Foreground is the FG, in Perspective Positioning the un-warped Input is
// the BG. Fewer than four usable trackers: a console line and no output.
//
// Outputs: SteadyPosition, SteadyAxis, SteadySize and SteadyAngle are the
// Center, Pivot, Size and Angle of a Transform that steadies the shot;
// UnsteadyPosition, UnsteadySize and UnsteadyAngle (with the pivot at the
// reference) put the motion back.
//
// Thread safety: trackers are made and removed, and runs started, on the
// main thread between renders; CheckRequest and Process run on the render
// thread and change a tracker only under its lock.
#include <atomic>
#include <map>
#include <memory>
#include <vector>

#include "host/flow/MergeInputs.h"
#include "host/flow/Operator.h"
#include "host/image/TransformSampler.h"
#include "operators/track/MatchMove.h"
#include "operators/track/TrackerData.h"
#include "operators/track/TrackerInputs.h"

namespace Orvane {

class RenderTask;
class TransformMatrix;
struct QuadPoint;

class TrackerDeluxe : public ThreadedOperator {
public:
    TrackerDeluxe(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~TrackerDeluxe() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    bool ControlCommand(int command, const TagList &tags) override;

    /// The tracker numbers of TrackerList, in its order.
    std::vector<int> TrackerNumbers() const;
    const std::map<int, std::unique_ptr<TrackerData>> &Trackers() const { return trackers_; }

    /// Tracks every enabled tracker from frame `from` to frame `to` (either way) in `task` and writes the paths.
    /// False, with a console line, when no tracker is enabled or nothing could be tracked; an abort keeps what was
    /// tracked before it.
    bool RunTracking(double from, double to, RenderTask *task);

private:
    TrackerData *EnsureTracker(int n);
    /// The trackers of TrackerList, in its order.
    std::vector<TrackerData *> ListedTrackers() const;
    /// Makes the trackers the list names and takes out the others.
    void FollowList(const std::vector<int> &numbers);
    void SetTrackerList(const std::vector<int> &numbers);
    void ShowForOperation(int operation, int pivotType, int reference);
    void RefreshTrackerChoices();
    /// Whether `out` is one of the tool's steady or unsteady outputs (they need the Input's frame).
    bool IsToolMotionOutput(const Output *out) const;
    /// The motion of the enabled trackers from their reference to the request's time.
    tracking::Motion MotionAt(Request *req, double aspect) const;
    /// Reference and ReferenceIntermediatePoints at the request's time.
    tracking::ReferenceMode ReferenceOf(Request *req) const;
    /// How much `tracker` counts at the request's time (its fade in and out within the render range).
    double WeightOf(Request *req, const TrackerData &tracker) const;
    /// The corners of the corner modes at the request's time, in a w x h frame: the first four enabled trackers
    /// with paths, turned by CornerTurns, and how much the least of them counts; null with the reason when there
    /// is no convex quad.
    const char *CornerQuad(Request *req, double w, double h, QuadPoint quad[4], double &weight) const;
    /// Operation "Match Move": the Merge choice with the motion, one resampling.
    void MatchMove(Request *req, TransformMatrix *bg, const tracking::Motion &m);
    /// Operations "Corner Positioning" and "Perspective Positioning".
    void CornerPin(Request *req, TransformMatrix *bg, bool perspective);
    /// The sampling the Filter, Window and Edges controls choose.
    TransformSampling SamplingOf(Request *req) const;
    void Report(const char *fmt, ...) __attribute__((format(printf, 2, 3)));

    TrackerInputs shared_;
    Input *trackerList_, *input_, *foreground_, *operation_, *merge_;
    std::unique_ptr<MergeInputs> mergeInputs_;
    Input *mappingType_, *rotateCw_, *rotateCcw_, *cornerTurns_, *position_, *rotation_, *scaling_, *flatten_;
    Input *pivotType_, *tracker_, *pivot_, *reference_, *intermediate_, *fadeFrames_;
    Input *oldPivotType_, *oldPivot_;
    Output *output_, *steadyPosition_, *unsteadyPosition_, *steadyAxis_, *steadySize_, *unsteadySize_;
    Output *steadyAngle_, *unsteadyAngle_;
    int trackersPage_ = 0, operationPage_ = 0;
    std::map<int, std::unique_ptr<TrackerData>> trackers_;
    bool followingList_ = false;
    std::atomic<bool> stop_{false}; ///< Stop Tracking was pressed: the run ends after its current frame
};

} // namespace Orvane
