#include "operators/track/TrackerData.h"

#include <algorithm>
#include <cmath>
#include <mutex>

#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/InputAt.h"
#include "host/flow/Operator.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "operators/track/TrackerInputs.h"

namespace Orvane {
namespace {

std::string Numbered(const char *pattern, int n) {
    char buf[96];
    std::snprintf(buf, sizeof buf, pattern, n);
    return buf;
}

} // namespace

TrackerData::TrackerData(Operator *tool, int number, int page) : tool_(tool), number_(number) {
    const std::string point = Numbered("Point %d", number), prefix = Numbered("Tracker%d", number);
    auto add = [&](const std::string &name, const std::string &id, TagList tags) {
        tags.Set({ControlPage, page});
        Input *in = tool->AddInputTagList(name.c_str(), id.c_str(), tags);
        inputs_.push_back(in);
        return in;
    };
    auto number_tags = [](OvID control, double def, TagList extra = {}) {
        TagList tags{{LinkDataType, CLSID_DataType_Number}, {InputControl, control}, {InputDefault, def}};
        tags.Merge(extra);
        return tags;
    };
    label_ = add(point, Numbered("TrackerLabel%d", number),
                 {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Label}, {InputExternal, 0}});
    name_ = add(Numbered("Name %d", number), Numbered("Name%d", number),
                {{LinkDataType, CLSID_DataType_Text},
                 {InputControl, CLSID_InputControl_TextEdit},
                 {InputDefaultText, point.c_str()},
                 {InputExternal, 0}});
    enabled_ = add(Numbered("Enabled %d", number), Numbered("Enabled%d", number),
                   number_tags(CLSID_InputControl_Checkbox, 1.0));
    delete_ = add(Numbered("Delete %d", number), Numbered("Delete%d", number), tracking::ButtonTags(page));
    bestMatch_ = add(point + " Best Match", prefix + "BestMatch",
                     number_tags(CLSID_InputControl_Slider, 0.0, {{InputExternal, 0}, {InputPassive, 1}}));
    TagList channel =
        number_tags(CLSID_InputControl_Combo, 0.0, {{InputInteger, 1}, {InputMinAllowed, 0.0}, {InputMaxAllowed, 4.0}});
    for (const char *c : {"Luminance", "Red", "Green", "Blue", "Alpha"}) channel.Add({ListAddItem, c});
    channel_ = add(point + " Channel", prefix + "Channel", channel);
    showChannel_ = add(point + " Show Full Color / Channel", prefix + "ShowChannel",
                       number_tags(CLSID_InputControl_Checkbox, 0.0, {{InputExternal, 0}, {InputPassive, 1}}));
    patternCenter_ = add(Numbered("Pattern Center %d", number), Numbered("PatternCenter%d", number),
                         {{LinkDataType, CLSID_DataType_Point},
                          {InputControl, CLSID_InputControl_Offset},
                          {PreviewControl, CLSID_PreviewControl_Tracker},
                          {InputDefaultX, 0.5},
                          {InputDefaultY, 0.5}});
    auto size = [&](const char *name, const char *id, double def) {
        return add(Numbered(name, number), Numbered(id, number),
                   number_tags(CLSID_InputControl_Slider, def,
                               {{InputMinAllowed, 0.0}, {InputSliderLow, 0.0}, {InputSliderHigh, 0.5}}));
    };
    patternWidth_ = size("Pattern Width %d", "PatternWidth%d", 0.05);
    patternHeight_ = size("Pattern Height %d", "PatternHeight%d", 0.05);
    searchWidth_ = size("Search Width %d", "SearchWidth%d", 0.1);
    searchHeight_ = size("Search Height %d", "SearchHeight%d", 0.1);
    path_ = add(Numbered("Tracked Center %d", number), Numbered("TrackedCenter%d", number),
                {{LinkDataType, CLSID_DataType_Point},
                 {InputControl, CLSID_InputControl_Offset},
                 {InputDefaultX, 0.5},
                 {InputDefaultY, 0.5}});
    xOffset_ =
        add(Numbered("X Offset %d", number), Numbered("XOffset%d", number), number_tags(CLSID_InputControl_Screw, 0.0));
    yOffset_ =
        add(Numbered("Y Offset %d", number), Numbered("YOffset%d", number), number_tags(CLSID_InputControl_Screw, 0.0));

    // Outputs cannot be taken out of a tool: a tracker made again under a deleted one's number takes its outputs.
    auto output = [&](const std::string &name, const char *id, OvID type) {
        const std::string full = Numbered(id, number);
        Output *out = tool->FindOutput(full.c_str());
        if (!out) out = tool->AddOutputTagList(name.c_str(), full.c_str(), {{LinkDataType, type}});
        outputs_.push_back(out);
        return out;
    };
    position_ = output(Numbered("Tracker %d: Offset position", number), "Position%d", CLSID_DataType_Point);
    perspective_ =
        output(Numbered("Tracker %d: Perspective position", number), "PerspectivePosition%d", CLSID_DataType_Point);
    positionX_ = output(Numbered("Tracker %d: Offset X position", number), "PositionX%d", CLSID_DataType_Number);
    positionY_ = output(Numbered("Tracker %d: Offset Y position", number), "PositionY%d", CLSID_DataType_Number);
    perspectiveX_ =
        output(Numbered("Tracker %d: Perspective X position", number), "PerspectivePositionX%d", CLSID_DataType_Number);
    perspectiveY_ =
        output(Numbered("Tracker %d: Perspective Y position", number), "PerspectivePositionY%d", CLSID_DataType_Number);
    steady_ = output(Numbered("Tracker %d: Steady position", number), "SteadyPosition%d", CLSID_DataType_Point);
    unsteady_ = output(Numbered("Tracker %d: Unsteady position", number), "UnsteadyPosition%d", CLSID_DataType_Point);
}

TrackerData::~TrackerData() = default;

std::string TrackerData::DisplayName() const {
    if (const auto *t = dynamic_cast<const Text *>(name_->ValueAt(0.0).Get())) return t->value;
    return Numbered("Point %d", number_);
}

bool TrackerData::IsEnabled(double time) const {
    const auto *n = dynamic_cast<const Orvane::Number *>(enabled_->ValueAt(time).Get());
    return !n || n->value >= 0.5;
}

TrackerData::Pattern TrackerData::PatternAt(const Request *req, double time) const {
    Pattern p{};
    InputPointAt(req, patternCenter_, time, p.x, p.y, 0.5, 0.5);
    p.width = InputNumberAt(req, patternWidth_, time, 0.05);
    p.height = InputNumberAt(req, patternHeight_, time, 0.05);
    p.searchWidth = InputNumberAt(req, searchWidth_, time, 0.1);
    p.searchHeight = InputNumberAt(req, searchHeight_, time, 0.1);
    p.channel = static_cast<int>(std::lround(InputNumberAt(req, channel_, time, 0.0))) - 1;
    return p;
}

void TrackerData::BeginRun() {
    std::lock_guard<std::recursive_mutex> lock(matcher_.Lock());
    stats_ = {};
    offsetX_ = offsetY_ = 0.0;
    last_ = {};
    active_ = false;
    points_.clear();
}

ImgRectI TrackerData::NeededRect(const Request *req, int width, int height) {
    std::lock_guard<std::recursive_mutex> lock(matcher_.Lock());
    const Pattern p = PatternAt(req, req->Time());
    if (!active_) {
        // The pattern is taken from this frame and tracked in it: the search area around the pattern's centre, and
        // the pattern itself with a pixel to spare (the matcher learns the pattern's size only when it takes it).
        matcher_.SetSearchArea(p.searchWidth, p.searchHeight);
        const double halfW = p.width * width / 2 + 1, halfH = p.height * height / 2 + 1;
        const ImgRectI pattern(static_cast<int>(std::floor(p.x * width - halfW)),
                               static_cast<int>(std::floor(p.y * height - halfH)),
                               static_cast<int>(std::ceil(p.x * width + halfW)) + 1,
                               static_cast<int>(std::ceil(p.y * height + halfH)) + 1);
        return matcher_.GetSearchRect(width, height, p.x, p.y) | pattern;
    }
    return matcher_.GetSearchRect(width, height, last_.x, last_.y);
}

bool TrackerData::Step(const Request *req, const Image *img, double time, TrackSettings &settings) {
    std::lock_guard<std::recursive_mutex> lock(matcher_.Lock());
    if (!img) return false;
    double x = last_.x, y = last_.y;
    if (!active_) {
        // The run's first frame: the pattern is taken here, and the path's offset is fixed for the run.
        const Pattern p = PatternAt(req, time);
        matcher_.Reset();
        matcher_.SetChannel(p.channel);
        matcher_.SetSearchArea(p.searchWidth, p.searchHeight);
        if (!matcher_.SetPattern(img, p.x, p.y, p.width, p.height, time)) return false;
        offsetX_ = offsetY_ = 0.0;
        if (settings.pathCenter && path_->Curve() && !path_->Curve()->Empty()) {
            double px = p.x, py = p.y;
            InputPointAt(req, path_, time, px, py, p.x, p.y);
            offsetX_ = px - p.x, offsetY_ = py - p.y;
        }
        x = p.x, y = p.y;
        active_ = true;
    }
    // Positions are fractions of the frame, so the expected position is the same at any proxy scale.
    img->DownloadGPUMem();
    const TrackResult found = matcher_.Track(img, time, x, y, settings);
    if (!found.found) return false;
    last_ = found;
    tracking::TakeStep(stats_, points_, found.x, found.y, found.match, offsetX_, offsetY_, time, settings.adaptiveLow);
    return true;
}

int TrackerData::WritePath(double runStart, int framesPerPoint) {
    std::lock_guard<std::recursive_mutex> lock(matcher_.Lock());
    if (points_.empty()) return 0;
    const std::vector<tracking::PathPoint> keys = tracking::KeyPoints(points_, runStart, framesPerPoint);
    AnimCurve curve;
    if (path_->Curve()) curve = *path_->Curve();
    const auto [lo, hi] = std::minmax(points_.front().time, points_.back().time);
    std::vector<double> stale;
    for (const Keyframe &k : curve.Keys())
        if (k.time >= lo && k.time <= hi) stale.push_back(k.time);
    for (double t : stale) curve.RemoveKey(t);
    for (const tracking::PathPoint &k : keys) curve.SetKey(k.time, MakeRef<Point>(k.x, k.y));
    path_->SetCurve(std::move(curve));
    return static_cast<int>(keys.size());
}

void TrackerData::ShowLastMatch() {
    double match = 0.0;
    {
        std::lock_guard<std::recursive_mutex> lock(matcher_.Lock());
        match = last_.match;
    }
    bestMatch_->SetValue(MakeRef<Orvane::Number>(match));
}

bool TrackerData::PositionAt(const Request *req, double time, double &x, double &y) const {
    if (!path_->Curve() || path_->Curve()->Empty()) return false;
    InputPointAt(req, path_, time, x, y, 0.5, 0.5);
    x += InputNumberAt(req, xOffset_, time, 0.0);
    y += InputNumberAt(req, yOffset_, time, 0.0);
    return true;
}

bool TrackerData::ReferenceAt(const Request *req, const tracking::ReferenceMode &ref, double time, double &x,
                              double &y) const {
    const AnimCurve *curve = path_->Curve();
    if (!curve || curve->Empty()) return false;
    const double first = curve->Keys().front().time, last = curve->Keys().back().time;
    switch (ref.mode) {
    case 0: return PositionAt(req, ref.selectTime, x, y);
    case 2:
        tracking::SmoothReference(
            first, last, ref.intermediate + 2, time,
            [&](double t, double &px, double &py) { PositionAt(req, t, px, py); }, x, y);
        return true;
    case 3: return PositionAt(req, last, x, y);
    default: return PositionAt(req, first, x, y);
    }
}

double TrackerData::Weight(double time, double rangeStart, double rangeEnd, int fadeFrames) const {
    const AnimCurve *curve = path_->Curve();
    if (!curve || curve->Empty()) return 0.0;
    const double first = curve->Keys().front().time, last = curve->Keys().back().time;
    const double ramp = std::max(fadeFrames, 0) + 1.0;
    double w = 1.0;
    if (first > rangeStart && time < first) w = 1.0 - (first - time) / ramp;
    if (last < rangeEnd && time > last) w = 1.0 - (time - last) / ramp;
    return std::clamp(w, 0.0, 1.0);
}

void TrackerData::SetOutputs(Request *req, const tracking::ReferenceMode &ref,
                             const std::function<bool(double &, double &)> &flatten) const {
    const double t = req->Time();
    double x = 0.5, y = 0.5, rx = 0.5, ry = 0.5;
    if (IsEnabled(t)) {
        if (!PositionAt(req, t, x, y)) {
            InputPointAt(req, path_, t, x, y, 0.5, 0.5);
            x += InputNumberAt(req, xOffset_, t, 0.0);
            y += InputNumberAt(req, yOffset_, t, 0.0);
            rx = x, ry = y;
        } else {
            ReferenceAt(req, ref, t, rx, ry);
        }
    }
    double fx = x, fy = y;
    if (flatten && !flatten(fx, fy)) fx = x, fy = y;
    req->SetOutputData(position_, MakeRef<Point>(x, y));
    req->SetOutputData(positionX_, MakeRef<Orvane::Number>(x));
    req->SetOutputData(positionY_, MakeRef<Orvane::Number>(y));
    req->SetOutputData(perspective_, MakeRef<Point>(fx, fy));
    req->SetOutputData(perspectiveX_, MakeRef<Orvane::Number>(fx));
    req->SetOutputData(perspectiveY_, MakeRef<Orvane::Number>(fy));
    req->SetOutputData(steady_, MakeRef<Point>(0.5 - (x - rx), 0.5 - (y - ry)));
    req->SetOutputData(unsteady_, MakeRef<Point>(0.5 + (x - rx), 0.5 + (y - ry)));
}

std::vector<TrackerData *> EnabledTrackers(const std::vector<TrackerData *> &trackers, double time) {
    std::vector<TrackerData *> enabled;
    for (TrackerData *t : trackers)
        if (t->IsEnabled(time)) enabled.push_back(t);
    return enabled;
}

void AskSearchAreas(Request *req, Input *image, const std::vector<TrackerData *> &trackers) {
    if (req->GetFlags() & ReqFlagSkipRoI) return;
    const AutoImageDoD dod(req, image);
    if (!dod || !dod->HasFrame()) return;
    const int W = dod->FrameWidth(), H = dod->FrameHeight();
    ImgRectI need;
    for (TrackerData *t : EnabledTrackers(trackers, req->Time())) need = need | t->NeededRect(req, W, H);
    if (need.IsNull()) return;
    const ImageDomain region = dod->WithRect(need);
    req->SetInputRoI(image, &region);
}

int TrackFrames(Output *out, const std::vector<TrackerData *> &trackers, double from, double to, RenderTask *task,
                int framesPerPoint, const std::atomic<bool> &stop) {
    RenderTask own;
    if (!task) task = &own;
    for (TrackerData *t : trackers) t->BeginRun();
    const double step = to >= from ? 1.0 : -1.0;
    const long frames = std::lround(std::fabs(to - from)) + 1;
    EvalOptions options;
    options.flags = ReqFlagTrackStep;
    options.task = task;
    options.useCache = false;
    for (long i = 0; i < frames && !task->IsAborted() && !stop; ++i) {
        if (!Evaluate(out, from + step * static_cast<double>(i), options)) break;
        for (TrackerData *t : trackers) t->ShowLastMatch();
    }
    int points = 0;
    for (TrackerData *t : trackers) {
        points += static_cast<int>(t->Points().size());
        t->WritePath(from, framesPerPoint);
    }
    return points;
}

} // namespace Orvane
