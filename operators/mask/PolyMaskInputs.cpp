#include "operators/mask/PolyMaskInputs.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/shape/PolyLine.h"
#include "host/shape/Shape.h"
#include "host/shape/StripRasterizer.h"
#include "operators/mask/PrimitiveGeometry.h"

namespace Orvane {

/// The placement of a line for one request: line coordinates (fractions of
/// the frame's width and height, about Center) to mask space.
struct PolyMaskInputs::Frame {
    int width = 1;                           ///< W, the mask's width in pixels
    double aspect = 1.0;                     ///< Y runs 0..aspect over the height
    double yPixels = 1.0;                    ///< pixels per unit of mask-space Y
    double size = 1.0;                       ///< Size
    double cx = 0.5, cy = 0.5;               ///< Center in mask space
    double m[2][3] = {{1, 0, 0}, {0, 1, 0}}; ///< the rotation's X and Y rows; depth is dropped
    double tolerance = 0.0;                  ///< 2 / (W x Size)

    ShapePoint At(double x, double y) const {
        const double v[2] = {x * size, y * aspect * size};
        return {cx + m[0][0] * v[0] + m[0][1] * v[1], cy + m[1][0] * v[0] + m[1][1] * v[1]};
    }
};

namespace {

constexpr double kDegrees = std::numbers::pi / 180.0;

/// r := a x r for 3 x 3 matrices.
void PreMultiply(const double a[3][3], double r[3][3]) {
    double t[3][3];
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) t[i][j] = a[i][0] * r[0][j] + a[i][1] * r[1][j] + a[i][2] * r[2][j];
    std::copy(&t[0][0], &t[0][0] + 9, &r[0][0]);
}

void Unite(ShapeBox &box, const ShapeBox &more) {
    if (more.IsEmpty()) return;
    if (box.IsEmpty()) {
        box = more;
        return;
    }
    box = {std::min(box.x0, more.x0), std::min(box.y0, more.y0), std::max(box.x1, more.x1), std::max(box.y1, more.y1)};
}

} // namespace

PolyMaskInputs::PolyMaskInputs(MaskOperator *owner, std::string group, const Options &options)
    : SubInputs(owner, std::move(group)), owner_(owner), controls_(options.controls), raster_(owner) {
    const Adding adding(*this);
    if (!controls_) {
        ownControls_ = std::make_unique<MaskControls>();
        ownControls_->Add(owner);
        controls_ = ownControls_.get();
    }
    center_ = owner->AddInputTagList("Center", "Center",
                                     {{LinkDataType, CLSID_DataType_Point},
                                      {InputControl, CLSID_InputControl_Offset},
                                      {PreviewControl, CLSID_PreviewControl_Crosshair},
                                      {InputDefaultX, 0.5},
                                      {InputDefaultY, 0.5},
                                      {InputNotify, 1}});
    size_ = owner->AddInputTagList("Size", "Size",
                                   {{LinkDataType, CLSID_DataType_Number},
                                    {InputControl, CLSID_InputControl_Slider},
                                    {InputDefault, 1.0},
                                    {InputMinAllowed, 0.0},
                                    {InputSliderHigh, 5.0},
                                    {InputNotify, 1}});
    auto angle = [&](const char *label, const char *id, bool withPreview) {
        TagList t{{LinkDataType, CLSID_DataType_Number},
                  {InputControl, CLSID_InputControl_Screw},
                  {InputDefault, 0.0},
                  {InputSliderLow, 0.0},
                  {InputSliderHigh, 360.0},
                  {SliderSteps, 3601}};
        if (withPreview)
            t.Set({PreviewControl, CLSID_PreviewControl_Angle}),
                t.Set({PreviewInputFirst, static_cast<const void *>(center_)});
        return owner->AddInputTagList(label, id, t);
    };
    if (options.threeRotations) {
        rotation_[0] = angle("X Rotation", "XRotation", false);
        rotation_[1] = angle("Y Rotation", "YRotation", false);
        rotation_[2] = angle("Z Rotation", "ZRotation", true);
    } else {
        rotation_[2] = angle("Angle", "Angle", true);
    }
    fillMethod_ = owner->AddInputTagList("Fill Method", "FillMethod",
                                         {{LinkDataType, CLSID_DataType_Number},
                                          {InputControl, CLSID_InputControl_MultiButton},
                                          {ListAddItem, "Alternate"},
                                          {ListAddItem, "Non-zero Winding"},
                                          {InputDefault, 0.0},
                                          {InputMinAllowed, 0.0},
                                          {InputMaxAllowed, 1.0},
                                          {InputInteger, 1}});
    if (options.threeRotations)
        trackerSearchSize_ = owner->AddInputTagList("Tracker Search Size", "TrackerSearchSize",
                                                    {{LinkDataType, CLSID_DataType_Number},
                                                     {InputControl, CLSID_InputControl_Slider},
                                                     {InputDefault, 0.03},
                                                     {InputMinAllowed, 0.01},
                                                     {InputSliderHigh, 0.1}});
    const OvID lineType = options.bspline ? CLSID_DataType_BSplinePolyline : CLSID_DataType_Polyline;
    auto line = [&](const char *label, const char *id, const char *text, bool outer) {
        return owner->AddInputTagList(label, id,
                                      {{LinkDataType, lineType},
                                       {LinkSecondDataType, CLSID_DataType_CardinalSplinePolyline},
                                       {InputControl, CLSID_InputControl_Label},
                                       {PreviewControl, CLSID_PreviewControl_Polyline},
                                       {ControlLabel, text},
                                       {InputNotify, outer},
                                       {ControlVisible, !outer},
                                       {InputSendRequest, !outer}});
    };
    polyline_ = line("Polyline", "Polyline", "Right-click here for shape animation", false);
    polyline2_ = line("Polyline2", "Polyline2", "Right-click here for outer shape animation", true);
}

void PolyMaskInputs::NotifyChanged(Input *in, Parameter *param) {
    if (ownControls_) ownControls_->NotifyChanged(in, param);
    if (in != polyline2_ || polyline2_->SendsRequest()) return;
    // The outer line is asked for once it holds a point or comes from another tool.
    const auto *line = dynamic_cast<const PolyLine *>(param);
    if (in->Link() || in->IsAnimated() || (line && !line->points.empty()))
        polyline2_->SetAttrsTagList({{ControlVisible, 1}, {InputSendRequest, 1}});
}

PolyMaskInputs::Frame PolyMaskInputs::FrameOf(Request *req, const MaskFormat &format) const {
    Frame f;
    f.width = std::max(format.width, 1);
    f.aspect = (format.height * format.aspectY) / (f.width * format.aspectX);
    f.yPixels = f.width * format.aspectX / format.aspectY;
    f.size = req->GetInputNumber(size_, 1.0);
    f.tolerance = f.size > 0.0 ? 2.0 / (f.width * f.size) : 0.0;
    const auto *c = dynamic_cast<const Point *>(req->GetInputData(center_));
    f.cx = c ? c->x : 0.5;
    f.cy = (c ? c->y : 0.5) * f.aspect;
    // About Z, then X, then Y.
    double r[3][3] = {{1, 0, 0}, {0, 1, 0}, {0, 0, 1}};
    const double az = req->GetInputNumber(rotation_[2]) * kDegrees;
    const double rz[3][3] = {{std::cos(az), -std::sin(az), 0}, {std::sin(az), std::cos(az), 0}, {0, 0, 1}};
    PreMultiply(rz, r);
    if (rotation_[0]) {
        const double ax = req->GetInputNumber(rotation_[0]) * kDegrees,
                     ay = req->GetInputNumber(rotation_[1]) * kDegrees;
        const double rx[3][3] = {{1, 0, 0}, {0, std::cos(ax), -std::sin(ax)}, {0, std::sin(ax), std::cos(ax)}};
        const double ry[3][3] = {{std::cos(ay), 0, std::sin(ay)}, {0, 1, 0}, {-std::sin(ay), 0, std::cos(ay)}};
        PreMultiply(rx, r);
        PreMultiply(ry, r);
    }
    for (int i = 0; i < 2; ++i)
        for (int j = 0; j < 3; ++j) f.m[i][j] = r[i][j];
    return f;
}

Ref<PolyLine> PolyMaskInputs::LineOf(Request *req, Input *in) const {
    auto *line = dynamic_cast<PolyLine *>(req->GetInputData(in));
    if (!line || line->points.empty()) return nullptr;
    if (const auto *cardinal = dynamic_cast<const CardinalSplinePolyLine *>(line)) return cardinal->ToBezier();
    return Ref<PolyLine>(line);
}

Ref<Shape> PolyMaskInputs::PathOf(const PolyLine &line, const Frame &f) const {
    Ref<Shape> path = MakeRef<Shape>();
    const std::vector<PolyPoint> &p = line.points;
    const int n = static_cast<int>(p.size());
    if (const auto *spline = dynamic_cast<const BSplinePolyLine *>(&line)) {
        std::vector<ShapePoint> at(p.size());
        std::vector<double> weights(p.size());
        for (size_t i = 0; i < p.size(); ++i) at[i] = f.At(p[i].x, p[i].y), weights[i] = p[i].weight;
        const TagList tags{{ShapeTolerance, f.tolerance}};
        if (spline->IsUniform())
            path->FlatBSplineTo(at.data(), n, line.closed, tags);
        else
            path->FlatTBSplineTo(at.data(), weights.data(), n, line.closed, tags);
    } else {
        const ShapePoint start = f.At(p[0].x, p[0].y);
        path->MoveTo(start.x, start.y);
        for (int i = 0; i < line.SegmentCount(); ++i) {
            const PolyPoint &a = p[size_t(i)], &b = p[size_t((i + 1) % n)];
            const ShapePoint to = f.At(b.x, b.y);
            if (a.straight) {
                path->LineTo(to.x, to.y);
                continue;
            }
            const ShapePoint c1 = f.At(a.x + a.rightX, a.y + a.rightY), c2 = f.At(b.x + b.leftX, b.y + b.leftY);
            path->BezierTo(c1.x, c1.y, c2.x, c2.y, to.x, to.y);
        }
    }
    if (n >= 2 && line.closed) path->Close();
    return path;
}

Ref<Shape> PolyMaskInputs::ShapeOf(Request *req, const PolyLine &line, const Frame &f, bool wholeWriteOn) const {
    if (!(f.size > 0.0) || line.points.empty()) return nullptr;
    const Ref<Shape> path = PathOf(line, f);
    const MaskControls &c = *controls_;
    const double border = req->GetInputNumber(c.borderWidth);
    TagList tags{{ShapeJoin, maskgeo::JoinOfButton(req->GetInputNumber(c.joinStyle))},
                 {ShapeTolerance, f.tolerance},
                 {ShapeMiterLimit, req->GetInputNumber(c.miterLimit, 10.0)}};
    const bool solid = req->GetInputNumber(c.solid, 1.0) >= 0.5;
    if (!solid || !line.closed || line.points.size() < 2) {
        // An open line is always a stroke, whatever Solid says.
        const maskgeo::WriteOn w = wholeWriteOn ? maskgeo::WriteOn{}
                                                : maskgeo::WriteOnRange(req->GetInputNumber(c.writePosition),
                                                                        req->GetInputNumber(c.writeLength, 1.0));
        tags.Set({ShapeCap, maskgeo::CapOfButton(req->GetInputNumber(c.capStyle))});
        tags.Set({ShapeWriteStart, w.start});
        tags.Set({ShapeWriteEnd, w.end});
        return path->OutlineOfShapeTagList(border, tags);
    }
    // The border straddles the edge: a solid shape grows by half of it.
    if (std::fabs(border) > maskgeo::kTiny) return path->ExpandOfShapeTagList(border / 2, true, tags);
    return path->IsFlat() ? path : path->FlattenOfShapeTagList(tags);
}

Ref<PolyLine> PolyMaskInputs::BandOuter(Request *req, const PolyLine *inner) const {
    if (!inner) return nullptr;
    Ref<PolyLine> outer = LineOf(req, polyline2_);
    if (!outer || *outer == *inner || (outer->points.size() == 1 && inner->points.size() == 1)) return nullptr;
    return outer;
}

ImgRectI PolyMaskInputs::PixelBox(Request *req, const MaskFormat &format) const {
    const Frame f = FrameOf(req, format);
    const Ref<PolyLine> inner = LineOf(req, polyline_);
    if (!inner || !(f.size > 0.0)) return {};
    ShapeBox box;
    if (const Ref<Shape> shape = ShapeOf(req, *inner, f, true)) box = shape->Bounds();
    if (const Ref<PolyLine> outer = BandOuter(req, inner.Get())) {
        // The band reaches from the inner curve to the outer one; a curve lies in the box of its control points.
        Unite(box, PathOf(*inner, f)->Bounds());
        Unite(box, PathOf(*outer, f)->Bounds());
    }
    if (box.IsEmpty()) return {};
    return maskgeo::PixelBox({box.x0, box.y0}, {box.x1, box.y1}, f.width, format.aspectX, format.aspectY);
}

bool PolyMaskInputs::DrawBand(Request *req, const PolyLine &inner, const PolyLine &outer, const Frame &f, Image *mask,
                              bool invert, bool closedSolid) const {
    // Both lines measured with Y in units of the width (Y x aspect).
    const double measure = 1.0 / f.aspect;
    auto lengthOf = [&](const PolyLine &l) { return l.points.size() >= 2 ? l.CalcLength(measure) : 0.0; };
    const double innerLength = lengthOf(inner), outerLength = lengthOf(outer);
    const double wanted =
        std::round(std::max(innerLength, outerLength) * f.width * f.size * MaskOperator::kBandTessellation);
    const int n = static_cast<int>(std::clamp(wanted, 1.0, double(1 << 22)));
    // Copies: their marks may be cleared.
    Ref<PolyLine> a(dynamic_cast<PolyLine *>(inner.Copy().Get()));
    Ref<PolyLine> b(dynamic_cast<PolyLine *>(outer.Copy().Get()));
    if (a->GetCount(PolyPoint::MatchMark) != b->GetCount(PolyPoint::MatchMark)) {
        a->ClearMatchMarks();
        b->ClearMatchMarks();
    }
    // Per-span counts of each line, merged by the larger, so that marked points face each other.
    const int spans = a->SpanCount();
    std::vector<int> countsA(static_cast<size_t>(spans)), countsB(static_cast<size_t>(spans)),
        merged(static_cast<size_t>(spans));
    a->GetSamplePoints(n + 1, measure, nullptr, countsA.data(), spans);
    b->GetSamplePoints(n + 1, measure, nullptr, countsB.data(), spans);
    int total = 1;
    for (int j = 0; j < spans; ++j) total += merged[size_t(j)] = std::max(countsA[size_t(j)], countsB[size_t(j)]);
    std::vector<PolySample> onA(static_cast<size_t>(total)), onB(static_cast<size_t>(total));
    if (a->GetSamplePoints(total, measure, onA.data(), merged.data(), spans) == total &&
        b->GetSamplePoints(total, measure, onB.data(), merged.data(), spans) == total) {
        // The longer line takes the even slots.
        const bool innerOnEven = innerLength >= outerLength;
        const std::vector<PolySample> &even = innerOnEven ? onA : onB, &odd = innerOnEven ? onB : onA;
        std::vector<StripPoint> strip(2 * size_t(total));
        for (size_t i = 0; i < size_t(total); ++i) {
            const ShapePoint e = f.At(even[i].x, even[i].y), o = f.At(odd[i].x, odd[i].y);
            strip[2 * i] = {e.x * f.width, e.y * f.yPixels};
            strip[2 * i + 1] = {o.x * f.width, o.y * f.yPixels};
        }
        StripRasterOptions options;
        options.innerOnEven = innerOnEven;
        options.invert = invert;
        options.subSamples = (req->GetFlags() & ReqFlagQuick) ? 1 : closedSolid ? 8 : 32;
        options.direct = closedSolid;
        options.request = req;
        options.operator_ = owner_;
        // A band whose memory was refused is dropped and its rows stay as they were.
        return !RasterizeStrip(strip.data(), strip.size(), mask, options).aborted;
    }
    return true;
}

bool PolyMaskInputs::Render(Request *req, Image *mask, const MaskFormat &format) const {
    const MaskControls &c = *controls_;
    const bool invert = maskgeo::InvertOn(req->GetInputNumber(c.invert));
    if (!req->IsPreCalc() && !mask->DataWindow().IsNull()) {
        const Frame f = FrameOf(req, format);
        const Ref<PolyLine> inner = LineOf(req, polyline_);
        Ref<Shape> shape = inner ? ShapeOf(req, *inner, f, false) : nullptr;
        if (!shape) shape = MakeRef<Shape>();
        const int winding =
            std::floor(req->GetInputNumber(fillMethod_) + 0.5) != 0.0 ? ShapeWindingNonZero : ShapeWindingEvenOdd;
        if (!raster_.Rasterize(req, *shape, mask, invert, winding)) return false;
        const Ref<PolyLine> outer = f.size > 0.0 ? BandOuter(req, inner.Get()) : nullptr;
        if (outer) {
            const bool closedSolid =
                inner->closed && inner->points.size() >= 2 && req->GetInputNumber(c.solid, 1.0) >= 0.5;
            if (!DrawBand(req, *inner, *outer, f, mask, invert, closedSolid)) return false;
        }
    }
    mask->SetCanvasColorFltChan(3, invert ? 1.f : 0.f);
    return true;
}

} // namespace Orvane
