#include "operators/mask/PrimitiveMask.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"

namespace Orvane {

using maskgeo::Pt;

void AddPolygon(Shape &shape, const std::vector<Pt> &points) {
    if (points.empty()) return;
    shape.MoveTo(points[0].x, points[0].y);
    for (size_t i = 1; i < points.size(); ++i) shape.LineTo(points[i].x, points[i].y);
    shape.Close();
}

PrimitiveMask::PrimitiveMask(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : MaskOperator(reg, args, tags) {}

void PrimitiveMask::AddCenterAndSize(bool ellipse) {
    center_ = AddInputTagList("Center", "Center",
                              {{LinkDataType, CLSID_DataType_Point},
                               {InputControl, CLSID_InputControl_Offset},
                               {PreviewControl, CLSID_PreviewControl_Crosshair},
                               {InputDefaultX, 0.5},
                               {InputDefaultY, 0.5}});
    const OvID preview = ellipse ? CLSID_PreviewControl_Ellipse : CLSID_PreviewControl_Rectangle;
    for (int axis = 0; axis < 2; ++axis) {
        TagList t{{LinkDataType, CLSID_DataType_Number},
                  {InputControl, CLSID_InputControl_Slider},
                  {PreviewControl, preview},
                  {ControlGroup, 1},
                  {ControlMember, axis},
                  {InputDefault, 0.5}};
        if (ellipse) t.Set({InputMinAllowed, 0.0}), t.Set({InputSliderHigh, 2.0});
        (axis ? height_ : width_) = AddInputTagList(axis ? "Height" : "Width", axis ? "Height" : "Width", t);
    }
}

void PrimitiveMask::AddAngle() {
    angle_ = AddInputTagList("Angle", "Angle",
                             {{LinkDataType, CLSID_DataType_Number},
                              {InputControl, CLSID_InputControl_Screw},
                              {PreviewControl, CLSID_PreviewControl_Angle},
                              {PreviewInputFirst, static_cast<const void *>(center_)},
                              {InputSliderLow, 0.0},
                              {InputSliderHigh, 360.0},
                              {SliderSteps, 3601},
                              {InputDefault, 0.0}});
}

PrimitiveMask::Space PrimitiveMask::SpaceOf(Request *req) const {
    const MaskFormat f = GetMaskFormat(req);
    Space s;
    s.width = std::max(f.width, 1);
    s.aspectX = f.aspectX, s.aspectY = f.aspectY;
    s.aspect = (f.height * f.aspectY) / (s.width * f.aspectX);
    s.tolerance = 2.0 / s.width;
    return s;
}

maskgeo::Placement PrimitiveMask::PlacementOf(Request *req, const Space &s, double sx, double sy) const {
    const auto *c = dynamic_cast<const Point *>(req->GetInputData(center_));
    return {sx, sy, req->GetInputNumber(angle_), c ? c->x : 0.5, (c ? c->y : 0.5) * s.aspect};
}

double PrimitiveMask::HalfWidth(Request *req) const { return req->GetInputNumber(width_) / 2; }
double PrimitiveMask::HalfHeight(Request *req) const { return req->GetInputNumber(height_) / 2; }

bool PrimitiveMask::InvertOf(Request *req) const { return maskgeo::InvertOn(req->GetInputNumber(InInvert())); }

maskgeo::WriteOn PrimitiveMask::WriteOnOf(Request *req) const {
    return maskgeo::WriteOnRange(req->GetInputNumber(InWritePosition()), req->GetInputNumber(InWriteLength(), 1.0));
}

TagList PrimitiveMask::ShapeTags(Request *req, const Space &s, int join, bool withMiterLimit, bool writeOn) const {
    TagList t{{ShapeJoin, join},
              {ShapeCap, maskgeo::CapOfButton(req->GetInputNumber(InCapStyle()))},
              {ShapeTolerance, s.tolerance}};
    if (writeOn) {
        const maskgeo::WriteOn w = WriteOnOf(req);
        t.Set({ShapeWriteStart, w.start}), t.Set({ShapeWriteEnd, w.end});
    }
    if (withMiterLimit) t.Set({ShapeMiterLimit, req->GetInputNumber(InMiterLimit(), 10.0)});
    return t;
}

void PrimitiveMask::Finish(Request *req, const Space &s, Ref<Shape> base, double border, int join, bool withMiterLimit,
                           bool forBox, Outline &out) const {
    const bool solid = req->GetInputNumber(InSolid(), 1.0) >= 0.5;
    out.halfBorder = border / 2;
    if (solid) {
        // The border's width straddles the edge: a solid shape grows by half of it.
        if (!forBox && std::fabs(border) > maskgeo::kTiny)
            base = base->ExpandOfShapeTagList(border / 2, true, ShapeTags(req, s, join, withMiterLimit, false));
        out.shape = base;
        return;
    }
    const bool partial = !WriteOnOf(req).Whole();
    out.boxFromShape = partial; // a part of the stroke: bound what is drawn
    if (!forBox || partial)
        out.shape = base->OutlineOfShapeTagList(border, ShapeTags(req, s, join, withMiterLimit, true));
}

void PrimitiveMask::PreProcess(Request *req) {
    const std::optional<ImgRectI> dod = GetMaskDoD(req);
    ImgRectI region;
    if (dod) {
        const Space s = SpaceOf(req);
        const Outline o = BuildShape(req, s, true);
        Pt lo{HUGE_VAL, HUGE_VAL}, hi{-HUGE_VAL, -HUGE_VAL};
        auto take = [&lo, &hi](double x, double y, double grow) {
            lo = {std::min(lo.x, x - grow), std::min(lo.y, y - grow)};
            hi = {std::max(hi.x, x + grow), std::max(hi.y, y + grow)};
        };
        if (o.boxFromShape && o.shape) {
            for (const Shape::SubPath &path : o.shape->SubPaths())
                for (const Shape::Vertex &v : path.points) take(v.x, v.y, 0.0);
        } else {
            for (const Pt &p : o.points) take(p.x, p.y, o.halfBorder);
        }
        if (lo.x <= hi.x && lo.y <= hi.y) region = maskgeo::PixelBox(lo, hi, s.width, s.aspectX, s.aspectY) & *dod;
    }
    SetMaskRegion(req, region);
    MaskOperator::PreProcess(req);
}

void PrimitiveMask::Process(Request *req) {
    Image *mask = GetMaskImage(req);
    if (!mask) return;
    const bool invert = InvertOf(req);
    if (!req->IsPreCalc() && !mask->DataWindow().IsNull()) {
        const Space s = SpaceOf(req);
        Outline o = BuildShape(req, s, false);
        const Ref<Shape> empty = MakeRef<Shape>();
        if (!raster_.Rasterize(req, o.shape ? *o.shape : *empty, mask, invert, ShapeWindingNonZero)) {
            SetMaskImage(req, nullptr);
            return;
        }
    }
    mask->SetCanvasColorFltChan(3, invert ? 1.f : 0.f);
}

} // namespace Orvane
