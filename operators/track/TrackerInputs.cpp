#include "operators/track/TrackerInputs.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "operators/track/TrackerStep.h"

namespace Orvane {
namespace {

Input *AddButton(Operator *tool, int page, const char *name, const char *id, const char *icon) {
    return tool->AddInputTagList(name, id,
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_Button},
                                  {ButtonIcon, icon},
                                  {ControlPage, page},
                                  {InputExternal, 0},
                                  {InputNotify, 1},
                                  {InputInitialNotify, 0},
                                  {InputPassive, 1}});
}

Input *AddChoice(Operator *tool, int page, const char *name, const char *id, std::initializer_list<const char *> items,
                 double def = 0.0) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_MultiButton},
                 {ControlPage, page},
                 {InputInteger, 1},
                 {InputMinAllowed, 0.0},
                 {InputMaxAllowed, static_cast<double>(items.size() - 1)},
                 {InputDefault, def}};
    for (const char *item : items) tags.Add({ListAddItem, item});
    return tool->AddInputTagList(name, id, tags);
}

} // namespace

TrackerInputs::TrackerInputs(Operator *tool) {
    page_ =
        tool->AddControlPageTagList("Trackers", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Tracker")}});
    reverse_ = AddButton(tool, page_, "Track Reverse", "TrackReverse", "Icons.Tracker.ReverseTime");
    bidirectional_ =
        AddButton(tool, page_, "Track Fwd Then Reverse", "TrackBidirectional", "Icons.Tracker.TrackBidirectional");
    forward_ = AddButton(tool, page_, "Track Forward", "TrackForward", "Icons.Tracker.ForwardTime");
    reverseOne_ =
        AddButton(tool, page_, "Track Reverse One Frame", "TrackReverseFromCurrentTime", "Icons.Tracker.ReverseFrame");
    stop_ = AddButton(tool, page_, "Stop Tracking", "StopTracking", "Icons.Tracker.Stop");
    forwardOne_ =
        AddButton(tool, page_, "Track Forward One Frame", "TrackForwardFromCurrentTime", "Icons.Tracker.ForwardFrame");
    framesPerPoint_ = tool->AddInputTagList("Frames Per Point", "FramesPerPathPoint",
                                            {{LinkDataType, CLSID_DataType_Number},
                                             {InputControl, CLSID_InputControl_Slider},
                                             {ControlPage, page_},
                                             {InputInteger, 1},
                                             {InputMinAllowed, 1.0},
                                             {InputSliderLow, 1.0},
                                             {InputSliderHigh, 10.0},
                                             {InputDefault, 1.0}});
    adaptiveMode_ = AddChoice(tool, page_, "Adaptive Mode", "AdaptiveMode", {"None", "Every Frame", "Best match"});
    matchTolerance_ = tool->AddInputTagList("Match Tolerance", "MatchTolerance",
                                            {{LinkDataType, CLSID_DataType_Number},
                                             {InputControl, CLSID_InputControl_Slider},
                                             {ControlPage, page_},
                                             {InputMinAllowed, 0.0},
                                             {InputMaxAllowed, 1.0},
                                             {InputSliderLow, 0.0},
                                             {InputSliderHigh, 0.25},
                                             {InputDefault, 0.1},
                                             {ControlVisible, 0}});
    pathCenter_ = AddChoice(tool, page_, "Path Center", "PathCenter", {"Pattern Center", "Track Center (Append)"});
}

TrackSettings TrackerInputs::Settings(const Request *req, bool tracking) const {
    return tracking::MakeSettings(tracking, req->GetInputNumber(matchTolerance_, 0.1),
                                  static_cast<int>(req->GetInputNumber(adaptiveMode_, 0.0) + 0.5),
                                  req->GetInputNumber(pathCenter_, 0.0), req->GetInputNumber(framesPerPoint_, 1.0));
}

TrackRun TrackerInputs::RunOf(const Input *in) const {
    if (in == forward_) return TrackRun::Forward;
    if (in == reverse_) return TrackRun::Reverse;
    if (in == bidirectional_) return TrackRun::Bidirectional;
    if (in == forwardOne_) return TrackRun::ForwardOneFrame;
    if (in == reverseOne_) return TrackRun::ReverseOneFrame;
    if (in == stop_) return TrackRun::Stop;
    return TrackRun::None;
}

} // namespace Orvane
