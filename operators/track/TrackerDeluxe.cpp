#include "operators/track/TrackerDeluxe.h"

#include <algorithm>
#include <cmath>
#include <cstdarg>
#include <functional>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/ControlCommand.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/InputAt.h"
#include "host/flow/InputValue.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PointMapping.h"
#include "host/image/QuadMap.h"
#include "host/image/TransformMatrix.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_TrackerDeluxe("Tracker");
static ClassRegistration<TrackerDeluxe, ThreadedOperator>
    s_TrackerRegistration(CLSID_TrackerDeluxe, &CLSID_ThreadedOperator,
                          {{RegTypeFlags, RegKindOperator | RegKindTool},
                           {RegClassName, "TrackerDeluxe"},
                           {RegPath, "Tools/Tracking/Tracker"},
                           {RegName, "Tracker"},
                           {RegCategory, "Tracking"},
                           {RegAbbreviation, "Tra"},
                           {RegAlias, "Stabilize"},
                           {RegHelp, "Plenty of trackers"},
                           {RegIcon, "Icons.Tools.Icons.TrackerDeluxe"},
                           {RegNoAutoProxy, 1},
                           {RegUnpredictable, 1},
                           {RegSupportsRoI, 1},
                           {RegSupportsDoD, 1},
                           {RegKeepsTimeState, 1},
                           {RegOwnCacheValidity, 1}});

namespace {

enum Operation { OpNone, OpMatchMove, OpCorner, OpPerspective };
enum PivotType { PivotAverage, PivotSelected, PivotManual };
enum Reference { RefSelectTime, RefStart, RefStartEnd, RefEnd };

TagList Checkbox(int page, double def) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Checkbox},
            {ControlPage, page},
            {InputDefault, def}};
}

TagList Slider(int page, double low, double high, double def, TagList extra = {}) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_Slider},
                 {ControlPage, page},
                 {InputSliderLow, low},
                 {InputSliderHigh, high},
                 {InputDefault, def}};
    tags.Merge(extra);
    return tags;
}

std::vector<int> NumbersOf(const Parameter *value) {
    std::vector<int> numbers;
    const auto *table = dynamic_cast<const ScriptValue *>(value);
    if (!table || !table->value.IsTable()) return numbers;
    for (const auto &[key, v] : table->value.Entries()) {
        if (!v.IsNumber()) continue;
        const int n = static_cast<int>(std::floor(v.AsNumber() + 0.5));
        if (n > 0 && std::find(numbers.begin(), numbers.end(), n) == numbers.end()) numbers.push_back(n);
    }
    return numbers;
}

int Whole(const Parameter *p, int def) {
    const auto *n = dynamic_cast<const Number *>(p);
    return n ? static_cast<int>(std::lround(n->value)) : def;
}

/// Output pixel -> the warped layer's source through the bilinear quad map:
/// in Corner Positioning the quad is on the output (its inverse gives the
/// unit square), in Perspective Positioning on the layer (the output frame
/// is the unit square); then the layer's pending transform undone.
struct BilinearPin : PointMapping {
    BilinearQuad quad;
    bool quadOnOutput = true;
    double outW = 1, outH = 1, layerW = 1, layerH = 1;
    Matrix3 layerToSource;
    bool Map(double x, double y, double &u, double &v) const override {
        double lx, ly;
        if (quadOnOutput) {
            double s, t;
            if (!quad.Inverse(x, y, s, t)) return false;
            lx = s * layerW, ly = t * layerH;
        } else {
            quad.Forward(x / outW, y / outH, lx, ly);
        }
        layerToSource.Apply(lx, ly, u, v);
        return true;
    }
};

} // namespace

TrackerDeluxe::TrackerDeluxe(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags), shared_(this) {
    trackersPage_ = shared_.Page();
    trackerList_ = AddInputTagList("Tracker List", "TrackerList",
                                   {{LinkDataType, CLSID_DataType_ScriptVal},
                                    {InputControl, CLSID_InputControl_CheckList},
                                    {ControlPage, trackersPage_},
                                    {ControlVisible, 0},
                                    {InputExternal, 0},
                                    {InputNotify, 1}});
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    foreground_ = AddInputTagList("Foreground", "Foreground",
                                  {{LinkDataType, CLSID_DataType_Image},
                                   {LinkSecondDataType, CLSID_DataType_TransformMatrix},
                                   {LinkMain, 2},
                                   {InputRequired, 0},
                                   {ImageForeground, 1}});

    operationPage_ =
        AddControlPageTagList("Operation", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Operation")}});
    operation_ = AddInputTagList(
        "Operation", "Operation",
        tracking::ChoiceTags(operationPage_, {"None", "Match Move", "Corner Positioning", "Perspective Positioning"},
                             0.0, CLSID_InputControl_MultiButton));
    merge_ = AddInputTagList("Merge", "Merge",
                             tracking::ChoiceTags(operationPage_, {"BG only", "FG only", "FG over BG", "BG over FG"},
                                                  2.0, CLSID_InputControl_Combo));
    SetCurrentPage(operationPage_);
    mergeInputs_ = std::make_unique<MergeInputs>(this, foreground_, 0);
    mappingType_ = AddInputTagList(
        "Mapping type", "MappingType",
        tracking::ChoiceTags(operationPage_, {"Bi-Linear", "Perspective"}, 1.0, CLSID_InputControl_Combo));
    rotateCw_ = AddInputTagList("Rotate Clockwise", "RotateClockwise", tracking::ButtonTags(operationPage_));
    rotateCcw_ =
        AddInputTagList("Rotate Counter-Clockwise", "RotateCounterClockwise", tracking::ButtonTags(operationPage_));
    cornerTurns_ = AddInputTagList("Corner Turns", "CornerTurns",
                                   {{LinkDataType, CLSID_DataType_Number},
                                    {ControlPage, operationPage_},
                                    {ControlVisible, 0},
                                    {InputExternal, 0},
                                    {InputDefault, 0.0}});
    position_ = AddInputTagList("Position", "Position", Checkbox(operationPage_, 1.0));
    rotation_ = AddInputTagList("Rotation", "Rotation", Checkbox(operationPage_, 1.0));
    scaling_ = AddInputTagList("Scaling", "Scaling", Checkbox(operationPage_, 1.0));
    flatten_ = AddInputTagList("Flatten Transform", "FlattenTransform", Checkbox(operationPage_, 0.0));
    pivotType_ = AddInputTagList("Pivot type", "PivotType",
                                 tracking::ChoiceTags(operationPage_, {"Tracker average", "Selected tracker", "Manual"},
                                                      0.0, CLSID_InputControl_Combo));
    tracker_ = AddInputTagList("Tracker", "Tracker",
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Combo},
                                {ControlPage, operationPage_},
                                {InputInteger, 1},
                                {InputMinAllowed, 0.0},
                                {InputDefault, 0.0}});
    pivot_ = AddInputTagList("Pivot", "Pivot",
                             {{LinkDataType, CLSID_DataType_Point},
                              {InputControl, CLSID_InputControl_Offset},
                              {PreviewControl, CLSID_PreviewControl_Crosshair},
                              {ControlPage, operationPage_},
                              {InputDefaultX, 0.5},
                              {InputDefaultY, 0.5}});
    reference_ = AddInputTagList("Reference", "Reference",
                                 tracking::ChoiceTags(operationPage_, {"Select time", "Start", "Start & end", "End"},
                                                      1.0, CLSID_InputControl_MultiButton));
    intermediate_ =
        AddInputTagList("Reference Intermediate Points", "ReferenceIntermediatePoints",
                        Slider(operationPage_, 0.0, 10.0, 0.0, {{InputMinAllowed, 0.0}, {InputInteger, 1}}));
    fadeFrames_ = AddInputTagList("Incomplete Tracker Fade In/Out Frames", "IncompleteTrackerFadeInOutFrames",
                                  Slider(operationPage_, 0.0, 50.0, 25.0, {{InputMinAllowed, 0.0}, {InputInteger, 1}}));
    // Documents of older versions name the pivot controls AxisType and Axis: their values go to the new ones.
    auto old = [&](const char *id, OvID type) {
        return AddInputTagList(id, id,
                               {{LinkDataType, type},
                                {ControlPage, operationPage_},
                                {ControlVisible, 0},
                                {InputExternal, 0},
                                {InputNotify, 1},
                                {InputInitialNotify, 0},
                                {LinkNotSaved, 1}});
    };
    oldPivotType_ = old("AxisType", CLSID_DataType_Number);
    oldPivot_ = old("Axis", CLSID_DataType_Point);

    const int options = AddControlPageTagList("Options", {});
    AddInputTagList("Show Pattern Names", "ShowPatternNamesInPreview",
                    {{LinkDataType, CLSID_DataType_Number},
                     {InputControl, CLSID_InputControl_Checkbox},
                     {ControlPage, options},
                     {InputDefault, 1.0},
                     {InputExternal, 0},
                     {InputPassive, 1}});
    AddInputTagList("Enlarge Pattern on Dragging", "ShowEnlargedPatternOnDragging",
                    {{LinkDataType, CLSID_DataType_Number},
                     {InputControl, CLSID_InputControl_Checkbox},
                     {ControlPage, options},
                     {InputDefault, 1.0},
                     {InputExternal, 0},
                     {InputPassive, 1}});
    AddInputTagList("Enlargement Scale", "EnlargementScale",
                    Slider(options, 0.0, 15.0, 5.0, {{InputInteger, 1}, {InputExternal, 0}, {InputPassive, 1}}));
    AddInputTagList("Search Area Scale", "SearchScale",
                    Slider(options, 0.0, 5.0, 1.0, {{InputMinAllowed, 0.001}, {InputExternal, 0}, {InputPassive, 1}}));
    SetCurrentPage(-1);

    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    auto out = [&](const char *name, const char *id, OvID type) {
        return AddOutputTagList(name, id, {{LinkDataType, type}});
    };
    steadyPosition_ = out("Steady Position", "SteadyPosition", CLSID_DataType_Point);
    unsteadyPosition_ = out("Unsteady Position", "UnsteadyPosition", CLSID_DataType_Point);
    steadyAxis_ = out("Steady Axis", "SteadyAxis", CLSID_DataType_Point);
    steadySize_ = out("Steady Size", "SteadySize", CLSID_DataType_Number);
    unsteadySize_ = out("Unsteady Size", "UnsteadySize", CLSID_DataType_Number);
    steadyAngle_ = out("Steady Angle", "SteadyAngle", CLSID_DataType_Number);
    unsteadyAngle_ = out("Unsteady Angle", "UnsteadyAngle", CLSID_DataType_Number);

    SetTrackerList({1});
    ShowForOperation(OpNone, PivotAverage, RefStart);
}

TrackerDeluxe::~TrackerDeluxe() = default;

std::vector<int> TrackerDeluxe::TrackerNumbers() const { return NumbersOf(trackerList_->Constant().Get()); }

void TrackerDeluxe::SetTrackerList(const std::vector<int> &numbers) {
    ScriptVal table = ScriptVal::Table();
    for (int n : numbers) table.Append(n);
    trackerList_->SetValue(MakeRef<ScriptValue>(table));
    FollowList(numbers); // also when the input does not notify (a value equal to the last)
}

TrackerData *TrackerDeluxe::EnsureTracker(int n) {
    if (n <= 0) return nullptr;
    if (auto it = trackers_.find(n); it != trackers_.end()) return it->second.get();
    auto made = std::make_unique<TrackerData>(this, n, trackersPage_);
    TrackerData *tracker = made.get();
    trackers_.emplace(n, std::move(made));
    // Values a document gave before the tracker existed.
    if (GetDoc() && KeptInputs().Size() != 0)
        for (Input *in : tracker->AllInputs()) {
            const ScriptVal key(in->ID().Text());
            const ScriptVal *kept = KeptInputs().Find(key);
            if (!kept) continue;
            const ScriptVal value = *kept;
            if (ApplyInputValue(*GetDoc(), in, value, {.keepUnknownLinks = true}).empty()) KeptInputs().Remove(key);
        }
    return tracker;
}

void TrackerDeluxe::FollowList(const std::vector<int> &numbers) {
    if (followingList_) return;
    followingList_ = true;
    for (auto it = trackers_.begin(); it != trackers_.end();) {
        if (std::find(numbers.begin(), numbers.end(), it->first) != numbers.end()) {
            ++it;
            continue;
        }
        RemoveInputs(it->second->AllInputs());
        it = trackers_.erase(it);
    }
    for (int n : numbers) EnsureTracker(n);
    followingList_ = false;
    RefreshTrackerChoices();
}

void TrackerDeluxe::RefreshTrackerChoices() {
    std::vector<std::string> names;
    for (int n : TrackerNumbers())
        if (auto it = trackers_.find(n); it != trackers_.end()) names.push_back(it->second->DisplayName());
    tracker_->SetChoices(names);
}

void TrackerDeluxe::ShowForOperation(int operation, int pivotType, int reference) {
    const bool matchMove = operation == OpMatchMove, corners = operation == OpCorner || operation == OpPerspective;
    const bool merging = operation != OpNone;
    std::vector<Input *> mergeControls = mergeInputs_->AllInputs();
    mergeControls.push_back(merge_);
    for (Input *in : mergeControls)
        if (in != foreground_) in->SetAttrsTagList({{ControlVisible, merging}});
    for (Input *in : {mappingType_, rotateCw_, rotateCcw_}) in->SetAttrsTagList({{ControlVisible, corners}});
    for (Input *in : {position_, rotation_, scaling_, flatten_, pivotType_, reference_})
        in->SetAttrsTagList({{ControlVisible, matchMove}});
    tracker_->SetAttrsTagList({{ControlVisible, matchMove && pivotType == PivotSelected}});
    pivot_->SetAttrsTagList({{ControlVisible, matchMove && pivotType == PivotManual}});
    intermediate_->SetAttrsTagList({{ControlVisible, matchMove && reference == RefStartEnd}});
}

void TrackerDeluxe::Report(const char *fmt, ...) {
    char line[512];
    va_list ap;
    va_start(ap, fmt);
    std::vsnprintf(line, sizeof line, fmt, ap);
    va_end(ap);
    if (GetDoc()) GetDoc()->PrintF(ConsoleError, "%s: %s\n", Name().c_str(), line);
}

void TrackerDeluxe::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (param) {
        if (in == trackerList_) {
            FollowList(NumbersOf(param));
        } else if (in == oldPivotType_) {
            pivotType_->SetValue(Ref<Parameter>(param));
        } else if (in == oldPivot_) {
            pivot_->SetValue(Ref<Parameter>(param));
        } else if (in == rotateCw_ || in == rotateCcw_) {
            // A clockwise quarter turn gives each corner the point of the corner after it, anticlockwise.
            const int turns = Whole(cornerTurns_->Constant().Get(), 0);
            cornerTurns_->SetValue(MakeRef<Number>(((turns + (in == rotateCw_ ? 3 : 1)) % 4 + 4) % 4));
        } else if (in == operation_ || in == pivotType_ || in == reference_) {
            ShowForOperation(Whole(operation_->Constant().Get(), 0), Whole(pivotType_->Constant().Get(), 0),
                             Whole(reference_->Constant().Get(), RefStart));
        } else if (const TrackRun run = shared_.RunOf(in); run != TrackRun::None) {
            if (run == TrackRun::Stop) {
                stop_ = true;
            } else if (GetDoc()) {
                const double start = GetDoc()->RenderStart(), end = GetDoc()->RenderEnd();
                RenderTask task;
                if (run == TrackRun::Forward) RunTracking(time, end, &task);
                if (run == TrackRun::Reverse) RunTracking(time, start, &task);
                if (run == TrackRun::ForwardOneFrame) RunTracking(time, time + 1.0, &task);
                if (run == TrackRun::ReverseOneFrame) RunTracking(time, time - 1.0, &task);
                if (run == TrackRun::Bidirectional && RunTracking(time, end, &task) && !task.IsAborted())
                    RunTracking(time, start, &task);
            }
        } else {
            for (auto &[n, tracker] : trackers_) {
                if (in == tracker->DeleteInput()) {
                    std::vector<int> numbers = TrackerNumbers();
                    numbers.erase(std::remove(numbers.begin(), numbers.end(), n), numbers.end());
                    SetTrackerList(numbers);
                    break; // the tracker is gone
                }
                if (in == tracker->NameInput()) {
                    RefreshTrackerChoices();
                    break;
                }
            }
        }
        mergeInputs_->NotifyChanged(in, param, time);
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

bool TrackerDeluxe::ControlCommand(int command, const TagList &tags) {
    if (command != CCMD_Track) return false;
    return RunTracking(tags.GetDouble(CCMD_TrackFrom, 0.0), tags.GetDouble(CCMD_TrackTo, 0.0),
                       tags.GetPtrAs<RenderTask>(CCMD_TrackTask));
}

std::vector<TrackerData *> TrackerDeluxe::ListedTrackers() const {
    std::vector<TrackerData *> listed;
    for (int n : TrackerNumbers())
        if (auto it = trackers_.find(n); it != trackers_.end()) listed.push_back(it->second.get());
    return listed;
}

bool TrackerDeluxe::RunTracking(double from, double to, RenderTask *task) {
    const std::vector<TrackerData *> enabled = EnabledTrackers(ListedTrackers(), from);
    if (enabled.empty()) {
        Report("No trackers are selected.");
        return false;
    }
    if (!std::isfinite(from) || !std::isfinite(to)) {
        Report("a run needs finite frames");
        return false;
    }
    stop_ = false;
    const int every = Whole(shared_.FramesPerPoint()->ValueAt(from).Get(), 1);
    if (TrackFrames(output_, enabled, from, to, task, every, stop_) == 0) {
        Report("nothing was tracked from frame %g", from);
        return false;
    }
    return true;
}

void TrackerDeluxe::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != input_->Priority() || req->IsPreCalc()) return;
    const Output *asked = req->AskedOutput();
    if (asked != output_ && !(req->GetFlags() & ReqFlagTrackStep) && !IsToolMotionOutput(asked)) {
        // A tracker's own outputs come from its path alone.
        req->SetInputData(input_, nullptr);
        req->SetInputData(foreground_, nullptr);
        return;
    }
    if (!(req->GetFlags() & ReqFlagTrackStep)) {
        // The corner maps may read any part of either image, whatever region is asked: whole frames.
        const int operation = static_cast<int>(std::lround(InputNumberAt(req, operation_, req->Time(), OpNone)));
        if ((operation == OpCorner || operation == OpPerspective) && !(req->GetFlags() & ReqFlagSkipRoI)) {
            req->SetInputRoI(input_, nullptr);
            req->SetInputRoI(foreground_, nullptr);
        }
        return;
    }
    req->SetInputData(foreground_, nullptr); // a tracking step reads the Input only
    AskSearchAreas(req, input_, ListedTrackers());
}

bool TrackerDeluxe::IsToolMotionOutput(const Output *out) const {
    for (const Output *o :
         {steadyPosition_, unsteadyPosition_, steadyAxis_, steadySize_, unsteadySize_, steadyAngle_, unsteadyAngle_})
        if (out == o) return true;
    return false;
}

tracking::ReferenceMode TrackerDeluxe::ReferenceOf(Request *req) const {
    return {static_cast<int>(std::lround(req->GetInputNumber(reference_, RefStart))),
            GetDoc() ? GetDoc()->RenderStart() : 0.0,
            static_cast<int>(std::lround(req->GetInputNumber(intermediate_, 0.0)))};
}

double TrackerDeluxe::WeightOf(Request *req, const TrackerData &tracker) const {
    const double start = GetDoc() ? GetDoc()->RenderStart() : -HUGE_VAL,
                 end = GetDoc() ? GetDoc()->RenderEnd() : HUGE_VAL;
    return tracker.Weight(req->Time(), start, end,
                          static_cast<int>(std::lround(req->GetInputNumber(fadeFrames_, 25.0))));
}

tracking::Motion TrackerDeluxe::MotionAt(Request *req, double aspect) const {
    const double t = req->Time();
    const tracking::ReferenceMode ref = ReferenceOf(req);
    tracking::MotionOptions o;
    o.position = req->GetInputNumber(position_, 1.0) >= 0.5;
    o.rotation = req->GetInputNumber(rotation_, 1.0) >= 0.5;
    o.scaling = req->GetInputNumber(scaling_, 1.0) >= 0.5;
    const int pivotType = static_cast<int>(std::lround(req->GetInputNumber(pivotType_, PivotAverage)));
    o.pivot = pivotType == PivotSelected ? tracking::Pivot::Selected
              : pivotType == PivotManual ? tracking::Pivot::Manual
                                         : tracking::Pivot::Average;
    if (const auto *p = dynamic_cast<const Point *>(req->GetInputData(pivot_))) o.manualX = p->x, o.manualY = p->y;
    o.aspect = aspect;
    const std::vector<TrackerData *> listed = ListedTrackers();
    const size_t selected = static_cast<size_t>(std::max(0L, std::lround(req->GetInputNumber(tracker_, 0.0))));
    std::vector<tracking::TrackPair> pairs;
    double strongest = 0.0;
    for (size_t i = 0; i < listed.size(); ++i) {
        tracking::TrackPair p{};
        p.weight = WeightOf(req, *listed[i]);
        if (!(p.weight > 0.0) || !listed[i]->IsEnabled(t) || !listed[i]->PositionAt(req, t, p.x, p.y) ||
            !listed[i]->ReferenceAt(req, ref, t, p.rx, p.ry))
            continue;
        if (i == selected) o.selected = pairs.size();
        strongest = std::max(strongest, p.weight);
        pairs.push_back(p);
    }
    // Where every tracker is fading, the motion fades with them rather than jumping to none.
    return tracking::FadeMotion(tracking::FitMotion(pairs, o), strongest);
}

const char *TrackerDeluxe::CornerQuad(Request *req, double w, double h, QuadPoint quad[4], double &weight) const {
    const double t = req->Time();
    std::vector<QuadPoint> found;
    weight = 1.0;
    for (TrackerData *tracker : ListedTrackers()) {
        double x, y;
        if (found.size() < 4 && tracker->IsEnabled(t) && tracker->PositionAt(req, t, x, y)) {
            found.push_back({x * w, y * h});
            weight = std::min(weight, WeightOf(req, *tracker));
        }
    }
    if (found.size() < 4) return "corner positioning needs four enabled trackers with paths";
    const int turns = static_cast<int>(std::lround(req->GetInputNumber(cornerTurns_, 0.0))) & 3;
    for (int c = 0; c < 4; ++c) quad[c] = found[(c + turns) % 4];
    if (!IsConvexQuad(quad)) return "the four trackers do not make a convex four-sided shape";
    return nullptr;
}

void TrackerDeluxe::Process(Request *req) {
    Parameter *value = req->GetInputData(input_);
    auto *img = dynamic_cast<Image *>(value);
    if ((req->GetFlags() & ReqFlagTrackStep) && !req->IsPreCalc()) {
        TrackSettings settings = shared_.Settings(req, !(req->GetFlags() & ReqFlagInteractive));
        for (TrackerData *t : EnabledTrackers(ListedTrackers(), req->Time())) t->Step(req, img, req->Time(), settings);
    }
    // In the corner modes the perspective positions are the trackers' places in the plane of the four corners,
    // 0..1 across the rectangle they stand for.
    const int operation = static_cast<int>(std::lround(req->GetInputNumber(operation_, OpNone)));
    std::function<bool(double &, double &)> flatten;
    QuadPoint quad[4];
    double quadWeight = 1.0;
    Matrix3 toPlane;
    BilinearQuad bilinear;
    if ((operation == OpCorner || operation == OpPerspective) && !CornerQuad(req, 1.0, 1.0, quad, quadWeight)) {
        const QuadPoint unit[4] = {{0, 0}, {1, 0}, {1, 1}, {0, 1}};
        if (std::lround(req->GetInputNumber(mappingType_, 1.0)) == 1) {
            if (HomographyFromPoints(quad, unit, toPlane))
                flatten = [&](double &x, double &y) {
                    toPlane.Apply(x, y, x, y);
                    return std::isfinite(x) && std::isfinite(y);
                };
        } else if (bilinear.Set(quad)) {
            flatten = [&](double &x, double &y) { return bilinear.Inverse(x, y, x, y); };
        }
    }
    const tracking::ReferenceMode ref = ReferenceOf(req);
    for (auto &[n, tracker] : trackers_) tracker->SetOutputs(req, ref, flatten);

    auto bg = MakeRef<TransformMatrix>(value, req, input_, 0u, TimeUndefined);
    const double aspect = bg->IsValid() && bg->Width() > 0 && bg->XScale() > 0
                              ? bg->Height() * bg->YScale() / (bg->Width() * bg->XScale())
                              : 1.0;
    const tracking::Motion m = MotionAt(req, aspect);
    req->SetOutputData(steadyPosition_, MakeRef<Point>(0.5 - m.moveX, 0.5 - m.moveY));
    req->SetOutputData(unsteadyPosition_, MakeRef<Point>(0.5 + m.moveX, 0.5 + m.moveY));
    req->SetOutputData(steadyAxis_, MakeRef<Point>(m.pivotRefX + m.moveX, m.pivotRefY + m.moveY));
    req->SetOutputData(steadySize_, MakeRef<Number>(m.scale != 0.0 ? 1.0 / m.scale : 1.0));
    req->SetOutputData(unsteadySize_, MakeRef<Number>(m.scale));
    req->SetOutputData(steadyAngle_, MakeRef<Number>(-m.angle));
    req->SetOutputData(unsteadyAngle_, MakeRef<Number>(m.angle));
    if (req->AskedOutput() != output_) return;

    if (!bg->IsValid()) {
        Fail(req, "%s: no input image at time %g\n", Name().c_str(), req->Time());
        req->SetOutputData(output_, nullptr);
        return;
    }
    if (operation == OpNone || (req->GetFlags() & ReqFlagTrackStep)) {
        req->SetOutputData(output_, value);
        return;
    }
    if (operation == OpMatchMove)
        MatchMove(req, bg.Get(), m);
    else
        CornerPin(req, bg.Get(), operation == OpPerspective);
}

TransformSampling TrackerDeluxe::SamplingOf(Request *req) const {
    auto choice = [req](const Input *in, int def) {
        return in ? static_cast<int>(std::lround(req->GetInputNumber(in, def))) : def;
    };
    return {choice(FindInput("FilterMethod"), RszLinear - RszFirst) + RszFirst,
            choice(FindInput("WindowMethod"), 0) + RszWindowHanning, choice(FindInput("Edges"), EdgeCanvas)};
}

void TrackerDeluxe::CornerPin(Request *req, TransformMatrix *bg, bool perspective) {
    const auto fail = [&](const char *why) {
        if (!(req->GetTask() && req->GetTask()->IsAborted()))
            Fail(req, "%s: %s (time = %g)\n", Name().c_str(), why, req->Time());
        req->SetOutputData(output_, nullptr);
    };
    // The corners in Input frame pixels.
    const double W = bg->Width(), H = bg->Height();
    QuadPoint quad[4];
    double weight = 1.0;
    if (const char *why = CornerQuad(req, W, H, quad, weight)) return fail(why);

    Parameter *bgValue = req->GetInputData(input_), *fgValue = req->GetInputData(foreground_);
    const int merge = static_cast<int>(std::lround(req->GetInputNumber(merge_, 2)));
    if (!perspective && (!fgValue || merge == 0)) {
        req->SetOutputData(output_, bgValue); // nothing to pin, or the plate alone
        return;
    }
    if (perspective && merge == 1 && fgValue) {
        req->SetOutputData(output_, fgValue);
        return;
    }
    // The warped layer: its source, and the map of output pixels to that source.
    Ref<TransformMatrix> layer =
        perspective ? Ref<TransformMatrix>(bg) : MakeRef<TransformMatrix>(fgValue, req, foreground_, 0u, TimeUndefined);
    if (!layer->IsValid()) return fail("the foreground is not an image");
    const Image &src = *layer->Source();
    Matrix3 layerToSource;
    if (!layer->SourceToOutput().Invert(layerToSource)) return fail("the layer's transform is singular");
    const double LW = layer->Width(), LH = layer->Height();
    const QuadPoint frame[4] = {{0, 0}, {LW, 0}, {LW, LH}, {0, LH}};
    const TransformSampling sampling = SamplingOf(req);
    const bool homography = std::lround(req->GetInputNumber(mappingType_, 1.0)) == 1;
    std::unique_ptr<PointMapping> mapping;
    if (homography) {
        Matrix3 toLayer, faced;
        if (!(perspective ? HomographyFromPoints(frame, quad, toLayer) : HomographyFromPoints(quad, frame, toLayer)))
            return fail("the four trackers do not make a usable mapping");
        const ImgRectI sf = src.Frame();
        if (!ProjectiveMapping::Facing(layerToSource * toLayer, 0.5 * (sf.x0 + sf.x1), 0.5 * (sf.y0 + sf.y1), faced))
            return fail("the four trackers do not make a usable mapping");
        mapping = std::make_unique<ProjectiveMapping>(faced);
    } else {
        auto pin = std::make_unique<BilinearPin>();
        pin->quad.Set(quad);
        pin->quadOnOutput = !perspective;
        pin->outW = W, pin->outH = H, pin->layerW = LW, pin->layerH = LH;
        pin->layerToSource = layerToSource;
        mapping = std::move(pin);
    }
    // Pinned, only the quad and the filter's reach around it show; un-warped, the whole frame.
    ImgRectI dw(0, 0, bg->Width(), bg->Height());
    if (!perspective && sampling.edges == EdgeCanvas) {
        const int reach = static_cast<int>(std::ceil(ResizeFilterSupport(sampling.filter))) + 2;
        double x0 = quad[0].x, y0 = quad[0].y, x1 = x0, y1 = y0;
        for (const QuadPoint &p : quad)
            x0 = std::min(x0, p.x), y0 = std::min(y0, p.y), x1 = std::max(x1, p.x), y1 = std::max(y1, p.y);
        dw &= ImgRectI(static_cast<int>(std::floor(x0)) - reach, static_cast<int>(std::floor(y0)) - reach,
                       static_cast<int>(std::ceil(x1)) + reach, static_cast<int>(std::ceil(y1)) + reach);
    }
    const std::atomic<bool> *abort = req->GetTask() ? req->GetTask()->AbortFlag() : nullptr;
    const FltPixel canvas = src.GetCanvasColor();
    Ref<Image> warped = NewImageTagList({{ImgLikeImage, &src},
                                         {ImgWidth, bg->Width()},
                                         {ImgHeight, bg->Height()},
                                         {ImgXScale, bg->XScale()},
                                         {ImgYScale, bg->YScale()},
                                         {ImgDataWindow, &dw},
                                         {ImgValidWindow, &dw},
                                         {ImgNoData, src.IsNoData()},
                                         {ImgCanvasColor, &canvas}});
    if (!warped) return fail("out of memory");
    if (!warped->IsNoData() && !dw.IsNull() &&
        (!const_cast<Image &>(src).DownloadGPUMem() || !MapImage(src, *warped, *mapping, sampling, abort)))
        return fail("the layer could not be resampled");

    // Merge as Match Move does: the warped layer is the FG when pinned, the BG when un-warped.
    Parameter *under = perspective ? static_cast<Parameter *>(warped.Get()) : bgValue;
    Parameter *over = perspective ? fgValue : static_cast<Parameter *>(warped.Get());
    if (merge == 0 || merge == 1 || !over) {
        req->SetOutputData(output_, merge == 1 && over ? over : under);
        return;
    }
    // "FG over BG" lays the FG onto the BG, "BG over FG" the BG onto the FG; the layer merged onto carries on.
    Parameter *onto = merge == 2 ? under : over, *laid = merge == 2 ? over : under;
    Ref<TransformMatrix> base = onto == warped.Get() ? MakeRef<TransformMatrix>(warped.Get())
                                : onto == bgValue
                                    ? Ref<TransformMatrix>(bg)
                                    : MakeRef<TransformMatrix>(fgValue, req, foreground_, 0u, TimeUndefined);
    // A corner tracker that joins or leaves mid-shot fades the merge in or out rather than freezing its corner.
    Ref<Parameter> keep(fgValue);
    req->SetInputData(foreground_, laid);
    const bool merged = mergeInputs_->Merge(
        req, base.Get(), TagList{{MrgBlend, weight * req->GetInputNumber(FindInput("MergeBlend"), 1.0)}});
    req->SetInputData(foreground_, keep.Get());
    if (!merged) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    req->SetOutputData(output_, base.Get());
}

void TrackerDeluxe::MatchMove(Request *req, TransformMatrix *bg, const tracking::Motion &m) {
    auto choice = [req](const Input *in, int def) {
        return static_cast<int>(std::lround(req->GetInputNumber(in, def)));
    };
    // The motion as a Transform step: steady takes the shot back to the reference, unsteady follows it.
    const auto step = [&](bool steady) {
        const double size = steady ? (m.scale != 0.0 ? 1.0 / m.scale : 1.0) : m.scale;
        return TagList{{XfPivotX, steady ? m.pivotRefX + m.moveX : m.pivotRefX},
                       {XfPivotY, steady ? m.pivotRefY + m.moveY : m.pivotRefY},
                       {XfCenterX, steady ? 0.5 - m.moveX : 0.5 + m.moveX},
                       {XfCenterY, steady ? 0.5 - m.moveY : 0.5 + m.moveY},
                       {XfXSize, size},
                       {XfYSize, size},
                       {XfAngle, steady ? -m.angle : m.angle}};
    };
    const TransformSampling sampling = SamplingOf(req);
    TagList resample{{XfEdges, sampling.edges},
                     {XfFilter, sampling.filter},
                     {XfWindow, sampling.window},
                     {XfFlatten, req->GetInputNumber(flatten_, 0.0) >= 0.5},
                     {XfGPUEnabled, IsGPUEnabled(req, false)},
                     {XfRequest, static_cast<const void *>(req)}};
    const auto moved = [&](Ref<TransformMatrix> tm, bool steady) {
        TagList tags = step(steady);
        tags.Merge(resample);
        return tm->IsValid() && tm->ImageConcatenateTagList(tags) ? tm : Ref<TransformMatrix>();
    };
    const auto fail = [&](const char *why) {
        if (!(req->GetTask() && req->GetTask()->IsAborted()))
            Fail(req, "%s: %s (time = %g)\n", Name().c_str(), why, req->Time());
        req->SetOutputData(output_, nullptr);
    };
    Parameter *bgValue = req->GetInputData(input_), *fgValue = req->GetInputData(foreground_);
    const int merge = choice(merge_, 2);
    Ref<TransformMatrix> result;
    if (merge == 0 || !fgValue) {
        // The background alone, steadied: the shot held still at its reference.
        result = moved(Ref<TransformMatrix>(bg), true);
    } else if (merge == 1) {
        result = moved(MakeRef<TransformMatrix>(fgValue, req, foreground_, 0u, TimeUndefined), false);
    } else {
        // One layer follows the shot and goes over or under the other; the merge resamples it once.
        Ref<TransformMatrix> fg = moved(MakeRef<TransformMatrix>(fgValue, req, foreground_, 0u, TimeUndefined), false);
        if (!fg) return fail("the foreground could not be moved");
        Ref<TransformMatrix> base = merge == 2 ? Ref<TransformMatrix>(bg) : fg;
        Ref<Parameter> keep(fgValue);
        req->SetInputData(foreground_, merge == 2 ? static_cast<Parameter *>(fg.Get()) : bgValue);
        const bool merged = mergeInputs_->Merge(req, base.Get(), TagList());
        req->SetInputData(foreground_, keep.Get());
        if (!merged) {
            req->SetOutputData(output_, nullptr);
            return;
        }
        result = base;
    }
    if (!result) return fail("out of memory");
    req->SetOutputData(output_, result.Get());
}
} // namespace Orvane
