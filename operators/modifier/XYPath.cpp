#include "operators/modifier/XYPath.h"

#include <algorithm>
#include <cmath>
#include <numbers>

#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputAt.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/flow/ResultCache.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_XYPath("XYPath");
static ClassRegistration<XYPath, ThreadedOperator>
    s_Registration(CLSID_XYPath, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindModifier},
                    {RegClassName, "XYPath"},
                    {RegPath, "Tools/Modifiers/XYPath"},
                    {RegName, "XY Path"},
                    {RegHelp, "Drives a point from two animated numbers, and gives its heading"},
                    {RegHasOperatorControl, 1},
                    {RegOutputType, "Point"}});

namespace {

constexpr const char *kAspectField = "r";

TagList NumberTags(double def, TagList extra = {}) {
    TagList tags{{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Screw}, {InputDefault, def}};
    tags.Merge(extra);
    return tags;
}

TagList ViewOption(OvID control, double def) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, control},
            {InputDefault, def},
            {InputExternal, 0},
            {InputPassive, 1}};
}

/// Widens [e0, e1] by the key times of `in`'s curve (none for a constant or a link).
void AddKeyExtent(const Input *in, double &e0, double &e1) {
    if (const AnimCurve *curve = in->Curve())
        for (const Keyframe &key : curve->Keys()) {
            e0 = std::min(e0, key.time);
            e1 = std::max(e1, key.time);
        }
}

} // namespace

XYPath::XYPath(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.XYPath")}});
    x_ = AddInputTagList("X", "X", NumberTags(0.5));
    y_ = AddInputTagList("Y", "Y", NumberTags(0.5));
    z_ = AddInputTagList("Z", "Z", NumberTags(0.0));
    center_ = AddInputTagList("Center", "Center",
                              {{LinkDataType, CLSID_DataType_Point},
                               {InputControl, CLSID_InputControl_Offset},
                               {PreviewControl, CLSID_PreviewControl_Crosshair},
                               {InputDefaultX, 0.5},
                               {InputDefaultY, 0.5}});
    size_ = AddInputTagList("Size", "Size", NumberTags(1.0, {{InputSliderLow, 0.0}, {InputSliderHigh, 5.0}}));
    angle_ = AddInputTagList("Angle", "Angle", NumberTags(0.0, {{InputSliderLow, 0.0}, {InputSliderHigh, 360.0}}));
    headingOffset_ = AddInputTagList("Heading Offset", "HeadingOffset",
                                     NumberTags(0.0, {{InputSliderLow, 0.0}, {InputSliderHigh, 360.0}}));

    // How the path shows in a view: kept with the document for an editor to use.
    AddInputTagList("Show Key Points", "ShowKeyPoints", ViewOption(CLSID_InputControl_Checkbox, 1.0));
    TagList drawMode = ViewOption(CLSID_InputControl_Combo, 0.0);
    drawMode.Merge({{InputInteger, 1}, {InputMinAllowed, 0.0}, {InputMaxAllowed, 3.0}});
    for (const char *mode : {"Done", "ClickAppend", "Freehand", "InsertAndModify"}) drawMode.Add({ListAddItem, mode});
    AddInputTagList("Draw Mode", "DrawMode", drawMode);
    AddInputTagList("Key Point Color", "KeyPointColor", ViewOption(CLSID_InputControl_Color, 0.0));
    AddInputTagList("Publishing Points Enabled", "PublishingPointsEnabled",
                    ViewOption(CLSID_InputControl_Checkbox, 0.0));
    AddInputTagList("Show View Controls", "ShowViewControls", ViewOption(CLSID_InputControl_Checkbox, 1.0));
    AddInputTagList("Plot Path In View", "PlotPathInView", ViewOption(CLSID_InputControl_Checkbox, 1.0));

    value_ = AddOutputTagList("Value", "Value", {{LinkDataType, CLSID_DataType_Point}});
    heading_ = AddOutputTagList("Heading", "Heading", {{LinkDataType, CLSID_DataType_Number}});
}

double XYPath::Aspect() const {
    const ScriptVal *r = const_cast<XYPath *>(this)->KeptFields().Find(kAspectField);
    return r && r->IsNumber() && std::isfinite(r->AsNumber()) && r->AsNumber() > 0 ? r->AsNumber() : 1.0;
}

void XYPath::SetAspect(double r) {
    KeptFields().Set(kAspectField, r);
    // The aspect is no input, so cached results do not know of it: everything made before goes.
    if (GetDoc()) GetDoc()->Cache().Clear();
}

void XYPath::Process(Request *req) {
    const double t = req->Time(), r = Aspect();
    const double angle = req->GetInputNumber(angle_, 0.0);
    if (req->AskedOutput() == heading_) {
        // Half a frame either side of t, kept within the keys of the curves.
        double e0 = 2e9, e1 = -2e9;
        AddKeyExtent(x_, e0, e1);
        AddKeyExtent(y_, e0, e1);
        const double t0 = t > e0 ? std::max(t - 0.5, e0) : t;
        const double t1 = t < e1 ? std::min(t + 0.5, e1) : t;
        // Our curves give no derivative, so each slope is the difference of the values at t0 and t1.
        double sx = 0.0, sy = 0.0;
        if (t0 < t1) {
            sx = InputNumberAt(req, x_, t1) - InputNumberAt(req, x_, t0);
            sy = InputNumberAt(req, y_, t1) - InputNumberAt(req, y_, t0);
        }
        const double heading =
            std::atan2(sy * r, sx) * 180.0 / std::numbers::pi + angle + req->GetInputNumber(headingOffset_, 0.0);
        req->SetOutputData(heading_, MakeRef<Number>(heading));
        return;
    }
    const double a = static_cast<float>(angle) * std::numbers::pi / 180.0;
    const double s = static_cast<float>(req->GetInputNumber(size_, 1.0));
    const double x = req->GetInputNumber(x_, 0.5), y = req->GetInputNumber(y_, 0.5);
    double cx = 0.5, cy = 0.5;
    if (const auto *c = dynamic_cast<const Point *>(req->GetInputData(center_))) cx = c->x, cy = c->y;
    const double dx = (x - 0.5) * s, dy = (y - 0.5) * s * r;
    const double px = dx * std::cos(a) - dy * std::sin(a) + cx;
    const double py = (dy * std::cos(a) + dx * std::sin(a)) / r + cy;
    req->SetOutputData(value_, MakeRef<Point>(px, py));
}

} // namespace Orvane
