#include "host/color/ColorCurvesTable.h"

#include <algorithm>
#include <cmath>

#include "host/flow/DataTypes.h"

namespace Orvane {

double RangeCurve::Evaluate(double x) const {
    if (points.empty()) return 0.0;
    double y;
    if (!(x > points.front().x))
        y = points.front().y;
    else if (x >= points.back().x)
        y = points.back().y;
    else {
        const auto next =
            std::upper_bound(points.begin(), points.end(), x, [](double v, const Point &p) { return v < p.x; });
        const Point &a = *(next - 1), &b = *next;
        double t = (x - a.x) / (b.x - a.x);
        if (smooth) t = t * t * (3.0 - 2.0 * t);
        y = a.y + (b.y - a.y) * t;
    }
    return std::clamp(y, 0.0, 1.0);
}

namespace {

RangeCurve Curve(std::vector<RangeCurve::Point> points, bool smooth) {
    std::stable_sort(points.begin(), points.end(),
                     [](const RangeCurve::Point &a, const RangeCurve::Point &b) { return a.x < b.x; });
    return RangeCurve{std::move(points), smooth};
}

ScriptVal CurveToScript(const RangeCurve &c) {
    ScriptVal v = ScriptVal::Table();
    v.Set("Smooth", ScriptVal(c.smooth));
    v.Set("Points", PointsToScript(c.points));
    return v;
}

bool CurveFromScript(const ScriptVal *v, RangeCurve &out) {
    if (!v || !v->IsTable()) return false;
    const ScriptVal *smooth = v->Find("Smooth"), *points = v->Find("Points");
    if (smooth && !smooth->IsBool()) return false;
    std::vector<RangeCurve::Point> pts;
    if (!points || !PointsFromScript(*points, pts) || pts.empty()) return false;
    out = Curve(std::move(pts), smooth && smooth->AsBool());
    return true;
}

} // namespace

ColorCurvesTable::ColorCurvesTable(Preset preset) {
    const bool smooth = preset == Preset::Smooth;
    shadows_ = Curve({{0.0, 1.0}, {0.5, 0.0}}, smooth);
    highlights_ = Curve({{0.5, 0.0}, {1.0, 1.0}}, smooth);
    Build();
}

ColorCurvesTable::ColorCurvesTable(RangeCurve shadows, RangeCurve highlights)
    : shadows_(Curve(std::move(shadows.points), shadows.smooth)),
      highlights_(Curve(std::move(highlights.points), highlights.smooth)) {
    Build();
}

void ColorCurvesTable::Build() {
    for (int i = 0; i < kSamples; ++i) {
        const double x = static_cast<double>(i) / (kSamples - 1);
        double s = shadows_.Evaluate(x), h = highlights_.Evaluate(x);
        if (s + h > 1.0) {
            const double sum = s + h;
            s /= sum, h /= sum;
        }
        table_[i][0] = static_cast<float>(s);
        table_[i][2] = static_cast<float>(h);
        table_[i][1] = static_cast<float>(std::max(0.0, 1.0 - s - h));
    }
}

OvID ColorCurvesTable::DataType() const { return CLSID_DataType_ColorCurves; }

ScriptVal ColorCurvesTable::ToScript() const {
    ScriptVal v = ScriptVal::Table("ColorCurves");
    v.Set("Shadows", CurveToScript(shadows_));
    v.Set("Highlights", CurveToScript(highlights_));
    return v;
}

Ref<ColorCurvesTable> ColorCurvesTable::FromScript(const ScriptVal &value) {
    if (!value.IsTable() || (!value.ClassName().empty() && value.ClassName() != "ColorCurves")) return nullptr;
    RangeCurve shadows, highlights;
    if (!CurveFromScript(value.Find("Shadows"), shadows) || !CurveFromScript(value.Find("Highlights"), highlights))
        return nullptr;
    return MakeRef<ColorCurvesTable>(std::move(shadows), std::move(highlights));
}

bool ColorCurvesTable::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const ColorCurvesTable *>(&other);
    return o && o->shadows_ == shadows_ && o->highlights_ == highlights_;
}

uint64_t ColorCurvesTable::Hash() const {
    uint64_t h = 0x63757276ull;
    for (const RangeCurve *c : {&shadows_, &highlights_}) {
        h = HashMix(h, c->smooth ? 1u : 0u);
        h = HashMix(h, c->points.size());
        for (const RangeCurve::Point &p : c->points) h = HashMix(HashMix(h, HashDouble(p.x)), HashDouble(p.y));
    }
    return h;
}

Ref<Parameter> ColorCurvesTable::Copy() const { return MakeRef<ColorCurvesTable>(shadows_, highlights_); }

} // namespace Orvane
