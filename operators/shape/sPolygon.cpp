// sPolygon and sBSpline: a shape from the line on the Polyline input, drawn
// as the polygon masks draw it. The line's points are fractions of the
// frame's width and height about Center; they are scaled by (Size, aspect x
// Size) into shape units, turned by Angle and moved to Center.
//
// sPolygon takes a Bezier line (straight or curved segments from each
// point's handles); sBSpline (the same class, registered apart) takes a
// B-spline line, whose uniform curve becomes cubic Beziers exactly (each
// span's four control points give one Bezier), so later tools flatten it for
// their own frame; a rational one (unequal weights) is flattened here, at
// the request's tessellation tolerance. Either takes a cardinal spline line
// too, as its Bezier copy. The shape is closed when the line is (with at
// least two points), else open.
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/shape/PolyLine.h"
#include "operators/frame/Registration.h"
#include "operators/shape/ShapeGenerator.h"

namespace Orvane {

namespace {

const OvID CLSID_sPolygon("sPolygon");
const OvID CLSID_sBSpline("sBSpline");

ShapePoint Mix(const ShapePoint &a, double wa, const ShapePoint &b, double wb, const ShapePoint &c, double wc) {
    return {a.x * wa + b.x * wb + c.x * wc, a.y * wa + b.y * wb + c.y * wc};
}

/// The uniform cubic B-spline of `p` as Beziers: the span over control points a, b, c, d runs from (a + 4b + c)/6
/// to (b + 4c + d)/6 with handles (2b + c)/3 and (b + 2c)/3. An open line gets a mirrored control point beyond
/// each end, so it runs from the first point to the last.
void AppendUniformBSpline(Shape &s, std::vector<ShapePoint> p, bool closed) {
    const int n = static_cast<int>(p.size());
    if (n < 2) {
        if (n == 1) s.MoveTo(p[0].x, p[0].y);
        return;
    }
    if (!closed) {
        p.insert(p.begin(), Mix(p[0], 2.0, p[1], -1.0, p[0], 0.0));
        p.push_back(Mix(p[size_t(n)], 2.0, p[size_t(n - 1)], -1.0, p[0], 0.0));
    }
    const int count = static_cast<int>(p.size());
    const int spans = closed ? n : n - 1;
    const auto at = [&](int i) { return p[size_t(((i % count) + count) % count)]; };
    const int first = closed ? -1 : 0; // the span's first control point
    for (int i = 0; i < spans; ++i) {
        const ShapePoint a = at(first + i), b = at(first + i + 1), c = at(first + i + 2), d = at(first + i + 3);
        if (i == 0) {
            const ShapePoint start = Mix(a, 1.0 / 6, b, 4.0 / 6, c, 1.0 / 6);
            s.MoveTo(start.x, start.y);
        }
        const ShapePoint c1 = Mix(b, 2.0 / 3, c, 1.0 / 3, a, 0.0), c2 = Mix(b, 1.0 / 3, c, 2.0 / 3, a, 0.0);
        const ShapePoint end = Mix(b, 1.0 / 6, c, 4.0 / 6, d, 1.0 / 6);
        s.BezierTo(c1.x, c1.y, c2.x, c2.y, end.x, end.y);
    }
}

} // namespace

class sPolygon : public ShapeGenerator {
public:
    sPolygon(const Registry *reg, const ScriptVal &args, const TagList &tags)
        : ShapeGenerator(reg, args, tags), bspline_(reg && reg->ID() == CLSID_sBSpline) {
        line_ = AddInputTagList("Polyline", "Polyline",
                                {{LinkDataType, bspline_ ? CLSID_DataType_BSplinePolyline : CLSID_DataType_Polyline},
                                 {LinkSecondDataType, CLSID_DataType_CardinalSplinePolyline},
                                 {InputControl, CLSID_InputControl_Label},
                                 {PreviewControl, CLSID_PreviewControl_Polyline},
                                 {ControlLabel, "Right-click here for shape animation"}});
        AddCenterInput();
        AddSizeInput();
        AddAngleInput();
    }

    void Process(Request *req) override {
        const VarianceState state(req);
        Ref<ShapeTree> tree = MakeRef<ShapeTree>(req);
        const auto *given = dynamic_cast<const PolyLine *>(req->GetInputData(line_));
        if (given && !given->points.empty()) {
            Ref<PolyLine> bezier;
            if (const auto *cardinal = dynamic_cast<const CardinalSplinePolyLine *>(given))
                bezier = cardinal->ToBezier(), given = bezier.Get();
            const double size = SizeOf(state), aspect = FrameAspect(req);
            const auto local = [&](double x, double y) { return ShapePoint{x * size, y * aspect * size}; };
            const Ref<Shape> shape = LocalShape(req, *given, local);
            tree->Root().AppendChild(PlacedNode(*shape, PlacementOf(req, state), state));
        }
        SetOutputTree(req, tree);
    }

private:
    template <class Local> static Ref<Shape> LocalShape(Request *req, const PolyLine &line, const Local &local) {
        Ref<Shape> s = MakeRef<Shape>();
        const std::vector<PolyPoint> &p = line.points;
        const int n = static_cast<int>(p.size());
        if (const auto *spline = dynamic_cast<const BSplinePolyLine *>(&line)) {
            std::vector<ShapePoint> at(p.size());
            std::vector<double> weights(p.size());
            for (size_t i = 0; i < p.size(); ++i) at[i] = local(p[i].x, p[i].y), weights[i] = p[i].weight;
            if (spline->IsUniform())
                AppendUniformBSpline(*s, at, line.closed);
            else
                s->FlatTBSplineTo(at.data(), weights.data(), n, line.closed,
                                  {{ShapeTolerance, TessellationTolerance(req)}});
        } else {
            const ShapePoint start = local(p[0].x, p[0].y);
            s->MoveTo(start.x, start.y);
            for (int i = 0; i < line.SegmentCount(); ++i) {
                const PolyPoint &a = p[size_t(i)], &b = p[size_t((i + 1) % n)];
                const ShapePoint to = local(b.x, b.y);
                if (a.straight) {
                    s->LineTo(to.x, to.y);
                    continue;
                }
                const ShapePoint c1 = local(a.x + a.rightX, a.y + a.rightY), c2 = local(b.x + b.leftX, b.y + b.leftY);
                s->BezierTo(c1.x, c1.y, c2.x, c2.y, to.x, to.y);
            }
        }
        if (n >= 2 && line.closed) s->Close();
        return s;
    }

    const bool bspline_;
    Input *line_;
};

static ClassRegistration<sPolygon, ShapeOperator> s_Polygon(CLSID_sPolygon, &CLSID_ShapeOperator,
                                                            ShapeToolRow("sPolygon", "sPolygon", "sPly",
                                                                         "Creates a shape from a polyline", true));
static ClassRegistration<sPolygon, ShapeOperator>
    s_BSpline(CLSID_sBSpline, &CLSID_sPolygon,
              ShapeToolRow("sBSpline", "sPolygon", "sBSp", "Creates a shape from a BSpline polyline", true));

} // namespace Orvane
