#include "host/color/SplineCurve.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

#include "host/flow/DataTypes.h"

namespace Orvane {

Spline::Spline(const std::vector<CurvePoint> &points, bool periodic) : periodic_(periodic) {
    for (const CurvePoint &p : points) x_.push_back(p.x), y_.push_back(p.y);
    if (periodic && !points.empty()) x_.push_back(points.front().x + 1.0), y_.push_back(points.front().y);
    const size_t knots = x_.size();
    m_.assign(knots, 0.0);
    if (knots < 2) return;
    // Chord slopes, then each knot's slope from its two chords (periodic: the
    // chords on either side of the seam are the last and the first).
    std::vector<double> chord(knots - 1);
    for (size_t k = 0; k + 1 < knots; ++k) chord[k] = (y_[k + 1] - y_[k]) / (x_[k + 1] - x_[k]);
    auto mean = [](double a, double b) { return a * b > 0.0 ? 0.5 * (a + b) : 0.0; };
    for (size_t k = 1; k + 1 < knots; ++k) m_[k] = mean(chord[k - 1], chord[k]);
    if (periodic)
        m_.front() = m_.back() = mean(chord.back(), chord.front());
    else
        m_.front() = chord.front(), m_.back() = chord.back();
    // Scale slopes down where a segment would overshoot its two points.
    for (size_t k = 0; k + 1 < knots; ++k) {
        if (chord[k] == 0.0) {
            m_[k] = m_[k + 1] = 0.0;
            continue;
        }
        const double a = m_[k] / chord[k], b = m_[k + 1] / chord[k], r = a * a + b * b;
        if (r > 9.0) {
            const double tau = 3.0 / std::sqrt(r);
            m_[k] = tau * a * chord[k], m_[k + 1] = tau * b * chord[k];
        }
    }
    // The seam is one knot seen from both sides: it keeps the smaller of its
    // two scaled slopes (they share a sign), which overshoots on neither side.
    if (periodic)
        m_.front() = m_.back() =
            std::min(std::fabs(m_.front()), std::fabs(m_.back())) * (m_.front() < 0.0 ? -1.0 : 1.0);
}

double Spline::Eval(double x, bool slope) const {
    if (x_.empty()) return 0.0;
    if (x_.size() == 1) return slope ? 0.0 : y_.front();
    if (periodic_) {
        x -= std::floor(x);
        if (x < x_.front()) x += 1.0;
    } else if (!(x > x_.front()) || x >= x_.back()) {
        // Straight on beyond the ends, with the end's slope.
        const size_t end = x > x_.front() ? x_.size() - 1 : 0;
        return slope ? m_[end] : y_[end] + (x - x_[end]) * m_[end];
    }
    const size_t k = std::min<size_t>(static_cast<size_t>(std::upper_bound(x_.begin(), x_.end(), x) - x_.begin()) - 1,
                                      x_.size() - 2);
    const double h = x_[k + 1] - x_[k], t = (x - x_[k]) / h, dy = y_[k + 1] - y_[k];
    const double m0 = m_[k] * h, m1 = m_[k + 1] * h;
    if (slope)
        return ((6.0 * t * t - 6.0 * t) * -dy + (3.0 * t * t - 4.0 * t + 1.0) * m0 + (3.0 * t * t - 2.0 * t) * m1) / h;
    const double t2 = t * t, t3 = t2 * t;
    return y_[k] + (3.0 * t2 - 2.0 * t3) * dy + (t3 - 2.0 * t2 + t) * m0 + (t3 - t2) * m1;
}

namespace {

std::string NumberText(double v) {
    char text[32];
    std::snprintf(text, sizeof text, "%g", v);
    return text;
}

} // namespace

SplineCurve::SplineCurve(std::vector<CurvePoint> points) : points_(std::move(points)) {
    std::stable_sort(points_.begin(), points_.end(),
                     [](const CurvePoint &a, const CurvePoint &b) { return a.x < b.x; });
}

std::string SplineCurve::Problem(bool periodic) const {
    if (points_.empty()) return "has no points";
    for (size_t i = 1; i < points_.size(); ++i)
        if (points_[i].x == points_[i - 1].x) return "has two points at x = " + NumberText(points_[i].x);
    if (periodic && (points_.front().x < 0.0 || points_.back().x >= 1.0))
        return "has a point outside 0 <= x < 1 (x = " +
               NumberText(points_.front().x < 0.0 ? points_.front().x : points_.back().x) + ")";
    return "";
}

bool SplineCurve::IsIdentity() const {
    // One point alone is a flat curve, even on the diagonal.
    return points_.size() >= 2 &&
           std::all_of(points_.begin(), points_.end(), [](const CurvePoint &p) { return p.x == p.y; });
}

bool SplineCurve::IsFlatAt(double value) const {
    return !points_.empty() &&
           std::all_of(points_.begin(), points_.end(), [value](const CurvePoint &p) { return p.y == value; });
}

OvID SplineCurve::DataType() const { return CLSID_DataType_LookUpTable; }

ScriptVal PointsToScript(const std::vector<CurvePoint> &points) {
    ScriptVal list = ScriptVal::Table();
    for (const CurvePoint &p : points) {
        ScriptVal pair = ScriptVal::Table();
        pair.Append(p.x);
        pair.Append(p.y);
        list.Append(std::move(pair));
    }
    return list;
}

bool PointsFromScript(const ScriptVal &list, std::vector<CurvePoint> &points) {
    points.clear();
    if (!list.IsTable() || list.ArrayLength() != list.Size()) return false;
    for (size_t i = 1; i <= list.ArrayLength(); ++i) {
        const ScriptVal *p = list.At(i);
        if (!p->IsTable() || p->ArrayLength() != 2 || p->Size() != 2) return false;
        const ScriptVal *x = p->At(1), *y = p->At(2);
        if (!x->IsNumber() || !y->IsNumber() || !std::isfinite(x->AsNumber()) || !std::isfinite(y->AsNumber()))
            return false;
        points.push_back({x->AsNumber(), y->AsNumber()});
    }
    return true;
}

ScriptVal SplineCurve::ToScript() const {
    ScriptVal v = ScriptVal::Table("LookUpTable");
    v.Set("Points", PointsToScript(points_));
    return v;
}

Ref<SplineCurve> SplineCurve::FromScript(const ScriptVal &value) {
    if (!value.IsTable() || (!value.ClassName().empty() && value.ClassName() != "LookUpTable")) return nullptr;
    const ScriptVal *points = value.Find("Points");
    std::vector<CurvePoint> pts;
    if (!points || value.Size() != 1 || !PointsFromScript(*points, pts)) return nullptr;
    return MakeRef<SplineCurve>(std::move(pts));
}

bool SplineCurve::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const SplineCurve *>(&other);
    return o && o->points_ == points_;
}

uint64_t SplineCurve::Hash() const {
    uint64_t h = HashMix(0x73706c6eull, points_.size());
    for (const CurvePoint &p : points_) h = HashMix(HashMix(h, HashDouble(p.x)), HashDouble(p.y));
    return h;
}

} // namespace Orvane
