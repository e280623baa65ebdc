#include "operators/track/TrackerModifier.h"

#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/ControlCommand.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_TrackerModifier("TrackerModifier");
static ClassRegistration<TrackerModifier, ThreadedOperator>
    s_ModifierRegistration(CLSID_TrackerModifier, &CLSID_ThreadedOperator,
                           {{RegTypeFlags, RegKindOperator | RegKindModifier},
                            {RegClassName, "TrackerModifier"},
                            {RegPath, "Tools/Modifiers/TrackerModifier"},
                            {RegName, "Tracker"},
                            {RegHelp, "Drives a point by a tracked feature of an image"},
                            {RegHasOperatorControl, 1},
                            {RegNoAutoProxy, 1},
                            {RegUnpredictable, 1},
                            {RegOutputType, "Point"}});

TrackerModifier::TrackerModifier(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags), shared_(this) {
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    tracker_ = std::make_unique<TrackerData>(this, 1, shared_.Page());
}

void TrackerModifier::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (param) {
        const TrackRun run = shared_.RunOf(in);
        if (run == TrackRun::Stop) {
            stop_ = true;
        } else if (run != TrackRun::None && GetDoc()) {
            const double start = GetDoc()->RenderStart(), end = GetDoc()->RenderEnd();
            RenderTask task;
            const double to = run == TrackRun::Forward           ? end
                              : run == TrackRun::Reverse         ? start
                              : run == TrackRun::ForwardOneFrame ? time + 1.0
                              : run == TrackRun::ReverseOneFrame ? time - 1.0
                                                                 : end;
            if (RunTracking(time, to, &task) && run == TrackRun::Bidirectional && !task.IsAborted())
                RunTracking(time, start, &task);
        }
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

bool TrackerModifier::ControlCommand(int command, const TagList &tags) {
    if (command != CCMD_Track) return false;
    return RunTracking(tags.GetDouble(CCMD_TrackFrom, 0.0), tags.GetDouble(CCMD_TrackTo, 0.0),
                       tags.GetPtrAs<RenderTask>(CCMD_TrackTask));
}

bool TrackerModifier::RunTracking(double from, double to, RenderTask *task) {
    if (!tracker_->IsEnabled(from)) {
        if (GetDoc()) GetDoc()->PrintF(ConsoleError, "%s: No trackers are selected.\n", Name().c_str());
        return false;
    }
    stop_ = false;
    const auto *every = dynamic_cast<const Number *>(shared_.FramesPerPoint()->ValueAt(from).Get());
    const int framesPerPoint = every ? static_cast<int>(std::lround(every->value)) : 1;
    if (TrackFrames(tracker_->AllOutputs().front(), {tracker_.get()}, from, to, task, framesPerPoint, stop_) == 0) {
        if (GetDoc()) GetDoc()->PrintF(ConsoleError, "%s: nothing was tracked from frame %g\n", Name().c_str(), from);
        return false;
    }
    return true;
}

void TrackerModifier::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if ((req->GetFlags() & ReqFlagTrackStep) && req->GetPri() == input_->Priority() && !req->IsPreCalc())
        AskSearchAreas(req, input_, {tracker_.get()});
}

void TrackerModifier::Process(Request *req) {
    if ((req->GetFlags() & ReqFlagTrackStep) && !req->IsPreCalc() && tracker_->IsEnabled(req->Time())) {
        TrackSettings settings = shared_.Settings(req, !(req->GetFlags() & ReqFlagInteractive));
        tracker_->Step(req, dynamic_cast<Image *>(req->GetInputData(input_)), req->Time(), settings);
    }
    tracker_->SetOutputs(req, tracking::ReferenceMode{}); // movement since the path's first key
}

} // namespace Orvane
