#pragma once
// TrackerInputs: the controls every tracker of a tool shares, on the page
// "Trackers": the six run buttons, FramesPerPathPoint, AdaptiveMode,
// MatchTolerance (hidden) and PathCenter. The Tracker tool and the tracker
// modifier both make one.
//
// Thread safety: made on the main thread in the tool's constructor; the
// settings are read on the tool's render thread.
#include <initializer_list>

#include "host/core/TagList.h"
#include "host/track/TrackPoint.h"

namespace Orvane {

class Input;
class Operator;
class Request;

/// The runs the buttons start.
enum class TrackRun { None, Forward, Reverse, Bidirectional, ForwardOneFrame, ReverseOneFrame, Stop };

namespace tracking {
/// The tags of a push button on `page` (with `icon` when given): it notifies and is not saved.
TagList ButtonTags(int page, const char *icon = nullptr);
/// The tags of a whole-number list control of `items` on `page`, default `def`.
TagList ChoiceTags(int page, std::initializer_list<const char *> items, double def, OvID control);
} // namespace tracking

class TrackerInputs {
public:
    /// Adds the page and its inputs to `tool`.
    explicit TrackerInputs(Operator *tool);

    /// The settings one request tracks with; `tracking` says whether the request is a step of a run.
    TrackSettings Settings(const Request *req, bool tracking) const;
    /// The run a button asks for (None for other inputs).
    TrackRun RunOf(const Input *in) const;

    int Page() const { return page_; }
    Input *FramesPerPoint() const { return framesPerPoint_; }
    Input *PathCenter() const { return pathCenter_; }

private:
    int page_ = 0;
    Input *reverse_, *bidirectional_, *forward_, *reverseOne_, *stop_, *forwardOne_;
    Input *framesPerPoint_, *adaptiveMode_, *matchTolerance_, *pathCenter_;
};

} // namespace Orvane
