#include "operators/track/TrackerInputs.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "operators/track/TrackerStep.h"

namespace Orvane {
namespace tracking {

TagList ButtonTags(int page, const char *icon) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_Button},
                 {ControlPage, page},
                 {InputExternal, 0},
                 {InputNotify, 1},
                 {InputInitialNotify, 0},
                 {InputPassive, 1}};
    if (icon) tags.Add({ButtonIcon, icon});
    return tags;
}

TagList ChoiceTags(int page, std::initializer_list<const char *> items, double def, OvID control) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, control},
                 {ControlPage, page},
                 {InputInteger, 1},
                 {InputMinAllowed, 0.0},
                 {InputMaxAllowed, static_cast<double>(items.size() - 1)},
                 {InputDefault, def},
                 {InputNotify, 1}};
    for (const char *item : items) tags.Add({ListAddItem, item});
    return tags;
}

} // namespace tracking

TrackerInputs::TrackerInputs(Operator *tool) {
    page_ =
        tool->AddControlPageTagList("Trackers", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Tracker")}});
    reverse_ = tool->AddInputTagList("Track Reverse", "TrackReverse",
                                     tracking::ButtonTags(page_, "Icons.Tracker.ReverseTime"));
    bidirectional_ = tool->AddInputTagList("Track Fwd Then Reverse", "TrackBidirectional",
                                           tracking::ButtonTags(page_, "Icons.Tracker.TrackBidirectional"));
    forward_ = tool->AddInputTagList("Track Forward", "TrackForward",
                                     tracking::ButtonTags(page_, "Icons.Tracker.ForwardTime"));
    reverseOne_ = tool->AddInputTagList("Track Reverse One Frame", "TrackReverseFromCurrentTime",
                                        tracking::ButtonTags(page_, "Icons.Tracker.ReverseFrame"));
    stop_ = tool->AddInputTagList("Stop Tracking", "StopTracking", tracking::ButtonTags(page_, "Icons.Tracker.Stop"));
    forwardOne_ = tool->AddInputTagList("Track Forward One Frame", "TrackForwardFromCurrentTime",
                                        tracking::ButtonTags(page_, "Icons.Tracker.ForwardFrame"));
    framesPerPoint_ = tool->AddInputTagList("Frames Per Point", "FramesPerPathPoint",
                                            {{LinkDataType, CLSID_DataType_Number},
                                             {InputControl, CLSID_InputControl_Slider},
                                             {ControlPage, page_},
                                             {InputInteger, 1},
                                             {InputMinAllowed, 1.0},
                                             {InputSliderLow, 1.0},
                                             {InputSliderHigh, 10.0},
                                             {InputDefault, 1.0}});
    adaptiveMode_ = tool->AddInputTagList(
        "Adaptive Mode", "AdaptiveMode",
        tracking::ChoiceTags(page_, {"None", "Every Frame", "Best match"}, 0.0, CLSID_InputControl_MultiButton));
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
    pathCenter_ = tool->AddInputTagList(
        "Path Center", "PathCenter",
        tracking::ChoiceTags(page_, {"Pattern Center", "Track Center (Append)"}, 0.0, CLSID_InputControl_MultiButton));
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
