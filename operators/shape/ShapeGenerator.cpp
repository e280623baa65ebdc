#include "operators/shape/ShapeGenerator.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Parameter.h"
#include "host/flow/Request.h"

namespace Orvane {

namespace {

constexpr double kRadians = std::numbers::pi / 180.0;

} // namespace

void AppendArc(Shape &shape, double cx, double cy, double rx, double ry, double startDeg, double sweepDeg) {
    const int pieces = std::max(1, static_cast<int>(std::ceil(std::fabs(sweepDeg) / 45.0 - 1e-9)));
    const double step = sweepDeg / pieces * kRadians;
    const double k = 4.0 / 3.0 * std::tan(step / 4.0);
    double a = startDeg * kRadians;
    for (int i = 0; i < pieces; ++i) {
        const double b = a + step;
        const double ca = std::cos(a), sa = std::sin(a), cb = std::cos(b), sb = std::sin(b);
        shape.BezierTo(cx + rx * (ca - k * sa), cy + ry * (sa + k * ca), cx + rx * (cb + k * sb),
                       cy + ry * (sb - k * cb), cx + rx * cb, cy + ry * sb);
        a = b;
    }
}

Ref<Shape> EllipseShape(double rx, double ry) {
    Ref<Shape> s = MakeRef<Shape>();
    s->MoveTo(rx, 0.0);
    AppendArc(*s, 0.0, 0.0, rx, ry, 0.0, 360.0);
    s->Close();
    return s;
}

Ref<Shape> RoundedRectangleShape(double w, double h, double radius) {
    const double hw = std::fabs(w) / 2, hh = std::fabs(h) / 2;
    const double r = std::clamp(radius, 0.0, std::min(hw, hh));
    Ref<Shape> s = MakeRef<Shape>();
    if (r <= 0.0) {
        s->MoveTo(-hw, -hh), s->LineTo(hw, -hh), s->LineTo(hw, hh), s->LineTo(-hw, hh);
        s->Close();
        return s;
    }
    // Each side's straight part, then the quarter circle round the next corner (a side of length 0 adds a
    // point on the one before it, which draws nothing).
    s->MoveTo(-hw + r, -hh);
    s->LineTo(hw - r, -hh);
    AppendArc(*s, hw - r, -hh + r, r, r, -90.0, 90.0);
    s->LineTo(hw, hh - r);
    AppendArc(*s, hw - r, hh - r, r, r, 0.0, 90.0);
    s->LineTo(-hw + r, hh);
    AppendArc(*s, -hw + r, hh - r, r, r, 90.0, 90.0);
    s->LineTo(-hw, -hh + r);
    AppendArc(*s, -hw + r, -hh + r, r, r, 180.0, 90.0);
    s->Close();
    return s;
}

Ref<Shape> RadialPolygonShape(int count, double rx, double ry, const std::vector<double> &scales) {
    Ref<Shape> s = MakeRef<Shape>();
    for (int k = 0; k < count; ++k) {
        const double a = (90.0 + 360.0 * k / count) * kRadians, f = scales[size_t(k) % scales.size()];
        const double x = rx * f * std::cos(a), y = ry * f * std::sin(a);
        k == 0 ? s->MoveTo(x, y) : s->LineTo(x, y);
    }
    s->Close();
    return s;
}

Ref<const Shape> FiniteOrNull(Ref<const Shape> shape) {
    if (!shape) return shape;
    const ShapeBox b = shape->Bounds();
    const bool finite = std::isfinite(b.x0) && std::isfinite(b.y0) && std::isfinite(b.x1) && std::isfinite(b.y1);
    return finite || b.IsEmpty() ? shape : nullptr;
}

TagList SliderTags(double def, double low, double high, double min) {
    TagList t{
        {InputControl, CLSID_InputControl_Slider}, {InputDefault, def}, {InputSliderLow, low}, {InputSliderHigh, high}};
    if (std::isfinite(min)) t.Add({InputMinAllowed, min});
    return t;
}

TagList CountTags(double def, double low, double high, double min, double max) {
    TagList t = SliderTags(def, low, high, min);
    t.Add({LinkDataType, CLSID_DataType_Number}), t.Add({InputMaxAllowed, max}), t.Add({InputInteger, 1});
    return t;
}

int CountOf(Request *req, const Input *in, int def, int min, int max) {
    const double v = req->GetInputNumber(in, def);
    return std::isfinite(v) ? static_cast<int>(std::clamp(std::round(v), double(min), double(max))) : def;
}

TagList ShapeToolRow(const char *id, const char *classWord, const char *abbreviation, const char *help,
                     bool generator) {
    const std::string path = std::string("Tools/Shape/") + id, icon = std::string("Icons.Tools.Icons.") + id;
    TagList t{{RegTypeFlags, RegFamilyShape | RegKindOperator | RegKindTool | (generator ? RegKindSource : 0)},
              {RegClassName, classWord},
              {RegPath, path.c_str()},
              {RegName, id},
              {RegCategory, "Shape"},
              {RegAbbreviation, abbreviation},
              {RegHelp, help},
              {RegIcon, icon.c_str()},
              {RegNoBlendControls, 1},
              {RegNoObjectMaterialControls, 1},
              {RegNoMotionBlurControls, 1},
              // The request's region carries the reference frame: its aspect places Center, its width sets the
              // flattening tolerance. The engine hands a region only to tools that take one.
              {RegSupportsRoI, 1}};
    if (generator)
        t.Add({RegShapeGenFilled, 1}), t.Add({RegShapeGenOutline, 1}), t.Add({RegShapeGenTransform, 1}),
            t.Add({RegShapeGenStyle, 1});
    t.Persist(); // the path and icon texts outlive this call
    return t;
}

ShapeGenerator::ShapeGenerator(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ShapeOperator(reg, args, tags, true) {}

double ShapeGenerator::FrameAspect(Request *req) {
    if (!req || !req->RoI() || !req->RoI()->HasFrame()) return 1.0;
    const ImageDomain &d = *req->RoI();
    const double across = d.FrameWidth() * d.xScale, up = d.FrameHeight() * d.yScale;
    return across > 0.0 && up > 0.0 ? up / across : 1.0;
}

void ShapeGenerator::AddCenterInput() {
    center_ = AddInputTagList("Center", "Center",
                              {{LinkDataType, CLSID_DataType_Point},
                               {InputControl, CLSID_InputControl_Offset},
                               {PreviewControl, CLSID_PreviewControl_Crosshair},
                               {InputDefaultX, 0.5},
                               {InputDefaultY, 0.5}});
}

void ShapeGenerator::AddWidthHeightInputs(double def) {
    for (int axis = 0; axis < 2; ++axis) {
        TagList t = SliderTags(def, 0.0, 1.0);
        t.Add({PreviewControl, CLSID_PreviewControl_Rectangle}), t.Add({ControlGroup, 1}), t.Add({ControlMember, axis});
        (axis ? height_ : width_) = AddVarianceInputTagList(axis ? "Height" : "Width", axis ? "Height" : "Width", t);
    }
}

void ShapeGenerator::AddSizeInput() { size_ = AddVarianceInputTagList("Size", "Size", SliderTags(1.0, 0.0, 5.0)); }

void ShapeGenerator::AddAngleInput() {
    angle_ = AddVarianceInputTagList("Angle", "Angle",
                                     {{InputControl, CLSID_InputControl_Screw},
                                      {PreviewControl, CLSID_PreviewControl_Angle},
                                      {InputSliderLow, 0.0},
                                      {InputSliderHigh, 360.0},
                                      {SliderSteps, 3601},
                                      {InputDefault, 0.0}});
}

ShapeGenerator::Placement ShapeGenerator::PlacementOf(Request *req, const VarianceState &state) const {
    Placement at;
    const auto *c = center_ ? dynamic_cast<const Point *>(req->GetInputData(center_)) : nullptr;
    at.cx = c ? c->x : 0.5;
    at.cy = (c ? c->y : 0.5) * FrameAspect(req);
    if (angle_) at.angle = angle_->GetValue(state);
    return at;
}

Ref<ShapeNode> ShapeGenerator::PlacedNode(const Shape &local, const Placement &at, const VarianceState &state) const {
    Ref<ShapeNode> node = MakeRef<ShapeNode>();
    node->SetShape(FiniteOrNull(local.TransformOfShape(Matrix3::Translate(at.cx, at.cy) * Matrix3::Rotate(at.angle))));
    node->SetAxis(at.cx, at.cy);
    node->SetStyle(GetStyle(state));
    return node;
}

void ShapeGenerator::OutputShape(Request *req, const Shape &local) const {
    const VarianceState state(req);
    Ref<ShapeTree> tree = MakeRef<ShapeTree>(req);
    tree->Root().AppendChild(PlacedNode(local, PlacementOf(req, state), state));
    SetOutputTree(req, tree);
}

} // namespace Orvane
