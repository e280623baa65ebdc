#include "host/shape/PolyLine.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <climits>
#include <cmath>
#include <cstring>

#include "host/core/ScriptVal.h"
#include "host/flow/DataTypes.h"

namespace Orvane {

/// A cubic Bezier segment in homogeneous coordinates: control points (hx, hy, w); the curve is (X/W, Y/W), so
/// rational B-spline pieces and plain Bezier pieces (w = 1) share one evaluation. A straight segment keeps its
/// ends in points 0 and 3 and is measured exactly.
struct CurveSegment {
    static constexpr int kPieces = 8; ///< measured sub-intervals of t, for inverting arc length
    std::array<double, 4> hx{}, hy{}, w{1.0, 1.0, 1.0, 1.0};
    bool line = false;
    std::array<double, kPieces + 1> arc{}; ///< arc length at t = i / kPieces
    double Length() const { return arc[kPieces]; }
};

namespace {

constexpr double kMinWeight = 1e-9; // blended weights stay above zero

CurveSegment Bezier(PolySample p0, PolySample c1, PolySample c2, PolySample p3) {
    CurveSegment s;
    s.hx = {p0.x, c1.x, c2.x, p3.x};
    s.hy = {p0.y, c1.y, c2.y, p3.y};
    return s;
}

CurveSegment Line(PolySample p0, PolySample p3) {
    CurveSegment s = Bezier(p0, p0, p3, p3);
    s.line = true;
    return s;
}

PolySample Position(const CurveSegment &s, double t) {
    if (s.line) return {s.hx[0] + (s.hx[3] - s.hx[0]) * t, s.hy[0] + (s.hy[3] - s.hy[0]) * t};
    const double m = 1.0 - t;
    const double b[4] = {m * m * m, 3 * t * m * m, 3 * t * t * m, t * t * t};
    double x = 0, y = 0, w = 0;
    for (int i = 0; i < 4; ++i) x += b[i] * s.hx[i], y += b[i] * s.hy[i], w += b[i] * s.w[i];
    return {x / w, y / w};
}

/// sqrt(a^2 + b^2), through hypot only where the squares overflow or vanish.
double Norm(double a, double b) {
    const double r = std::sqrt(a * a + b * b);
    return std::isfinite(r) && r > 1e-150 ? r : std::hypot(a, b);
}

/// |d position / dt|.
double Speed(const CurveSegment &s, double t) {
    if (s.line) return Norm(s.hx[3] - s.hx[0], s.hy[3] - s.hy[0]);
    const double m = 1.0 - t;
    const double b[4] = {m * m * m, 3 * t * m * m, 3 * t * t * m, t * t * t};
    const double d[3] = {3 * m * m, 6 * t * m, 3 * t * t}; // derivative basis on control point differences
    double x = 0, y = 0, w = 0, dx = 0, dy = 0, dw = 0;
    for (int i = 0; i < 4; ++i) x += b[i] * s.hx[i], y += b[i] * s.hy[i], w += b[i] * s.w[i];
    for (int i = 0; i < 3; ++i) {
        dx += d[i] * (s.hx[i + 1] - s.hx[i]);
        dy += d[i] * (s.hy[i + 1] - s.hy[i]);
        dw += d[i] * (s.w[i + 1] - s.w[i]);
    }
    return Norm(dx * w - x * dw, dy * w - y * dw) / (w * w);
}

/// Five-point Gauss-Legendre rule for the length between a and b.
double GaussLength(const CurveSegment &s, double a, double b) {
    static constexpr double x[5] = {0.0, 0.5384693101056831, -0.5384693101056831, 0.9061798459386640,
                                    -0.9061798459386640};
    static constexpr double wt[5] = {0.5688888888888889, 0.4786286704993665, 0.4786286704993665, 0.2369268850561891,
                                     0.2369268850561891};
    const double half = 0.5 * (b - a), mid = 0.5 * (a + b);
    double sum = 0;
    for (int i = 0; i < 5; ++i) sum += wt[i] * Speed(s, mid + half * x[i]);
    return sum * half;
}

/// Length between a and b, halving until two halves agree with the whole (about 1e-12 relative).
double ArcLength(const CurveSegment &s, double a, double b, double whole, int depth = 0) {
    const double mid = 0.5 * (a + b);
    const double left = GaussLength(s, a, mid), right = GaussLength(s, mid, b);
    if (depth >= 24 || std::fabs(left + right - whole) <= 1e-13 + 1e-12 * (left + right)) return left + right;
    return ArcLength(s, a, mid, left, depth + 1) + ArcLength(s, mid, b, right, depth + 1);
}
double ArcLength(const CurveSegment &s, double a, double b) {
    if (s.line) return Speed(s, 0) * (b - a);
    return ArcLength(s, a, b, GaussLength(s, a, b));
}

void Measure(CurveSegment &s) {
    s.arc[0] = 0;
    for (int i = 0; i < CurveSegment::kPieces; ++i)
        s.arc[i + 1] =
            s.arc[i] + ArcLength(s, double(i) / CurveSegment::kPieces, double(i + 1) / CurveSegment::kPieces);
}

/// The parameter t at arc length `along` from the segment's start: the measured piece, then Newton's method kept
/// inside the piece by bisection.
double ParamAt(const CurveSegment &s, double along) {
    const double length = s.Length();
    if (along <= 0 || length <= 0) return 0.0;
    if (along >= length) return 1.0;
    if (s.line) return along / length;
    const int piece =
        std::clamp(int(std::upper_bound(s.arc.begin(), s.arc.end(), along) - s.arc.begin()) - 1, 0, s.kPieces - 1);
    const double t0 = double(piece) / s.kPieces, want = along - s.arc[piece];
    double lo = t0, hi = double(piece + 1) / s.kPieces;
    const double pieceLength = s.arc[piece + 1] - s.arc[piece];
    double t = pieceLength > 0 ? lo + (hi - lo) * want / pieceLength : lo;
    for (int iter = 0; iter < 40; ++iter) {
        const double err = ArcLength(s, t0, t) - want;
        if (std::fabs(err) <= 1e-14 + 1e-13 * length) break;
        (err > 0 ? hi : lo) = t;
        const double speed = Speed(s, t);
        double next = speed > 0 ? t - err / speed : lo;
        if (!(next > lo && next < hi)) next = 0.5 * (lo + hi);
        t = next;
    }
    return t;
}

/// Bezier segments of points with handles (plain and cardinal lines), Y divided by yScale.
void BezierSegments(const std::vector<PolyPoint> &pts, int segments, double yScale, std::vector<CurveSegment> &out) {
    const size_t n = pts.size();
    for (int i = 0; i < segments; ++i) {
        const PolyPoint &a = pts[size_t(i)], &b = pts[(size_t(i) + 1) % n];
        const PolySample p0{a.x, a.y / yScale}, p3{b.x, b.y / yScale};
        out.push_back(a.straight ? Line(p0, p3)
                                 : Bezier(p0, {a.x + a.rightX, (a.y + a.rightY) / yScale},
                                          {b.x + b.leftX, (b.y + b.leftY) / yScale}, p3));
    }
}

double ValidAspect(double aspect) { return std::isfinite(aspect) && aspect > 0 ? aspect : 1.0; }

/// The curve measured: its segments with Y divided by `aspect`, and the arc length at each segment's start.
struct MeasuredCurve {
    std::vector<CurveSegment> segments;
    std::vector<double> start; ///< one more than segments: the total last
    double Total() const { return start.back(); }
};

} // namespace

// ---- the three kinds ----

int PolyLine::GetCount(uint32_t mask) const {
    if (mask == 0) return int(points.size());
    return int(std::count_if(points.begin(), points.end(), [mask](const PolyPoint &p) { return (p.flags & mask); }));
}

std::optional<PolySample> PolyLine::GetPublishedPoint(int index) const {
    if (index < 0 || size_t(index) >= points.size()) return std::nullopt;
    return PolySample{points[size_t(index)].x, points[size_t(index)].y};
}

int PolyLine::SegmentCount() const {
    const int n = int(points.size());
    return n < 2 ? 0 : closed ? n : n - 1;
}

int PolyLine::SpanCount() const { return GetCount(PolyPoint::MatchMark) + 1; }

void PolyLine::ClearMatchMarks() {
    for (PolyPoint &p : points) p.flags &= ~PolyPoint::MatchBits;
}

void PolyLine::BuildSegments(double yScale, std::vector<CurveSegment> &out) const {
    BezierSegments(points, SegmentCount(), yScale, out);
}

bool BSplinePolyLine::IsUniform() const {
    return std::all_of(points.begin(), points.end(), [&](const PolyPoint &p) { return p.weight == points[0].weight; });
}

void BSplinePolyLine::BuildSegments(double yScale, std::vector<CurveSegment> &out) const {
    const int n = int(points.size()), segments = SegmentCount();
    struct H {
        double x, y, w;
    };
    auto control = [&](int i) {
        const PolyPoint &p = points[size_t(i)];
        return H{p.weight * p.x, p.weight * p.y / yScale, p.weight};
    };
    // A closed line wraps; an open one mirrors its end points in homogeneous space, which makes the curve start
    // and end on them.
    auto at = [&](int i) {
        if (closed) return control(((i % n) + n) % n);
        if (i < 0 || i >= n) {
            const H e = control(i < 0 ? 0 : n - 1), f = control(i < 0 ? 1 : n - 2);
            return H{2 * e.x - f.x, 2 * e.y - f.y, 2 * e.w - f.w};
        }
        return control(i);
    };
    auto mix = [](H a, double wa, H b, double wb, H c, double wc) {
        return H{(wa * a.x + wb * b.x + wc * c.x) / 6, (wa * a.y + wb * b.y + wc * c.y) / 6,
                 (wa * a.w + wb * b.w + wc * c.w) / 6};
    };
    for (int i = 0; i < segments; ++i) {
        const H q0 = at(i - 1), q1 = at(i), q2 = at(i + 1), q3 = at(i + 2);
        // The uniform cubic B-spline piece as a Bezier: basis (1 4 1)/6 at the ends, thirds between.
        const H b[4] = {mix(q0, 1, q1, 4, q2, 1), mix(q1, 4, q2, 2, q2, 0), mix(q1, 2, q2, 4, q2, 0),
                        mix(q1, 1, q2, 4, q3, 1)};
        CurveSegment s;
        for (int k = 0; k < 4; ++k) s.hx[size_t(k)] = b[k].x, s.hy[size_t(k)] = b[k].y, s.w[size_t(k)] = b[k].w;
        out.push_back(s);
    }
}

Ref<PolyLine> CardinalSplinePolyLine::ToBezier() const {
    auto line = MakeRef<PolyLine>(points, closed);
    line->aspect = aspect;
    const size_t n = points.size();
    for (size_t i = 0; i < n; ++i) {
        const PolyPoint &prev = i > 0 ? points[i - 1] : closed ? points[n - 1] : points[i];
        const PolyPoint &next = i + 1 < n ? points[i + 1] : closed ? points[0] : points[i];
        PolyPoint &p = line->points[i];
        p.rightX = (next.x - prev.x) * tension / 3;
        p.rightY = (next.y - prev.y) * tension / 3;
        p.leftX = -p.rightX;
        p.leftY = -p.rightY;
    }
    return line;
}

void CardinalSplinePolyLine::BuildSegments(double yScale, std::vector<CurveSegment> &out) const {
    BezierSegments(ToBezier()->points, SegmentCount(), yScale, out);
}

std::optional<PolySample> PolyLine::PointAt(int segment, double t) const {
    if (segment < 0 || segment >= SegmentCount() || !(t >= 0 && t <= 1)) return std::nullopt;
    std::vector<CurveSegment> segments;
    BuildSegments(1.0, segments);
    return Position(segments[size_t(segment)], t);
}

// ---- length and samples ----

double PolyLine::CalcLength(double aspect) const {
    std::vector<CurveSegment> segments;
    BuildSegments(ValidAspect(aspect), segments);
    double total = 0;
    for (CurveSegment &s : segments) {
        Measure(s);
        total += s.Length();
    }
    return total;
}

namespace {

/// Split `intervals` over spans by length (largest remainders), at least one for a span of positive length.
void ShareBySpanLength(const std::vector<double> &lengths, int intervals, int *counts) {
    double total = 0;
    for (double l : lengths) total += l;
    const size_t spans = lengths.size();
    std::vector<std::pair<double, size_t>> remainders;
    int given = 0;
    for (size_t j = 0; j < spans; ++j) {
        const double share = total > 0 ? intervals * lengths[j] / total : 0.0;
        counts[j] = int(std::floor(share));
        given += counts[j];
        remainders.emplace_back(share - counts[j], j);
    }
    if (total > 0) {
        std::stable_sort(remainders.begin(), remainders.end(),
                         [](const auto &a, const auto &b) { return a.first > b.first; });
        for (size_t k = 0; k < remainders.size() && given < intervals; ++k, ++given) ++counts[remainders[k].second];
    }
    for (size_t j = 0; j < spans; ++j)
        if (lengths[j] > 0 && counts[j] == 0) counts[j] = 1;
}

} // namespace

int PolyLine::GetSamplePoints(int count, double aspect, PolySample *out, int *spans, int size) const {
    if (!out && !spans) return 0;
    const double yScale = ValidAspect(aspect);
    const int spanCount = spans ? SpanCount() : 1;
    if (spans && size < spanCount) return 0;
    if (out && spans && size != spanCount) return 0;

    MeasuredCurve curve;
    BuildSegments(yScale, curve.segments);
    curve.start.push_back(0.0);
    for (CurveSegment &s : curve.segments) {
        Measure(s);
        curve.start.push_back(curve.start.back() + s.Length());
    }
    // Span boundaries in arc length: the start, each marked point (point i starts segment i), the end.
    std::vector<double> bounds{0.0};
    if (spans)
        for (size_t i = 0; i < points.size(); ++i)
            if (points[i].flags & PolyPoint::MatchMark)
                bounds.push_back(curve.start[std::min(i, curve.segments.size())]);
    bounds.push_back(curve.Total());

    if (!out) {
        std::vector<double> lengths;
        for (size_t j = 0; j + 1 < bounds.size(); ++j) lengths.push_back(bounds[j + 1] - bounds[j]);
        ShareBySpanLength(lengths, std::max(count - 1, 0), spans);
        return spanCount;
    }
    int whole = std::max(count - 1, 0);
    const int *counts = spans ? spans : &whole;
    long long samples = 1;
    for (int j = 0; j < spanCount; ++j) {
        if (counts[j] < 0) return 0;
        samples += counts[j];
    }
    if (samples > count) return 0;

    std::vector<CurveSegment> unscaled; // positions in the line's own coordinates
    BuildSegments(1.0, unscaled);
    auto sampleAt = [&](double along) -> PolySample {
        if (curve.segments.empty()) return points.empty() ? PolySample{} : PolySample{points[0].x, points[0].y};
        const size_t last = curve.segments.size() - 1;
        if (along >= curve.Total()) return Position(unscaled[last], 1.0);
        const size_t k = std::min(
            size_t(std::upper_bound(curve.start.begin(), curve.start.end(), along) - curve.start.begin()) - 1, last);
        return Position(unscaled[k], ParamAt(curve.segments[k], along - curve.start[k]));
    };
    int written = 0;
    for (int j = 0; j < spanCount; ++j) {
        const double from = bounds[size_t(j)], length = bounds[size_t(j) + 1] - from;
        for (int s = 0; s < counts[j]; ++s) out[written++] = sampleAt(from + length * s / counts[j]);
    }
    out[written++] = sampleAt(curve.Total());
    return written;
}

// ---- comparison and blending ----

bool PolyLine::EqualToBy(const PolyLine &o, double tol) const {
    if (DataType() != o.DataType() || closed != o.closed || points.size() != o.points.size()) return false;
    auto near = [tol](double a, double b) { return a == b || std::fabs(a - b) <= tol; };
    auto *c = dynamic_cast<const CardinalSplinePolyLine *>(this);
    if (c && !near(c->tension, static_cast<const CardinalSplinePolyLine &>(o).tension)) return false;
    if (!near(aspect, o.aspect)) return false;
    for (size_t i = 0; i < points.size(); ++i) {
        const PolyPoint &a = points[i], &b = o.points[i];
        if (a.flags != b.flags || a.straight != b.straight || !near(a.x, b.x) || !near(a.y, b.y) || !near(a.z, b.z) ||
            !near(a.leftX, b.leftX) || !near(a.leftY, b.leftY) || !near(a.rightX, b.rightX) ||
            !near(a.rightY, b.rightY) || !near(a.weight, b.weight))
            return false;
    }
    return true;
}

bool PolyLine::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const PolyLine *>(&other);
    return o && *this == *o;
}

uint64_t PolyLine::Hash() const {
    uint64_t h = HashMix(HashBytes(DataType().Text(), std::strlen(DataType().Text())), closed);
    h = HashMix(h, HashDouble(aspect));
    if (auto *c = dynamic_cast<const CardinalSplinePolyLine *>(this)) h = HashMix(h, HashDouble(c->tension));
    for (const PolyPoint &p : points) {
        for (double v : {p.x, p.y, p.z, p.leftX, p.leftY, p.rightX, p.rightY, p.weight}) h = HashMix(h, HashDouble(v));
        h = HashMix(h, (uint64_t(p.flags) << 1) | p.straight);
    }
    return h;
}

void PolyLine::CopySettingsTo(PolyLine &to) const {
    to.closed = closed;
    to.aspect = aspect;
}

Ref<PolyLine> PolyLine::WithPoints(std::vector<PolyPoint> pts) const {
    auto line = MakeRef<PolyLine>(std::move(pts));
    CopySettingsTo(*line);
    return line;
}
Ref<PolyLine> BSplinePolyLine::WithPoints(std::vector<PolyPoint> pts) const {
    auto line = MakeRef<BSplinePolyLine>(std::move(pts));
    CopySettingsTo(*line);
    return line;
}
Ref<PolyLine> CardinalSplinePolyLine::WithPoints(std::vector<PolyPoint> pts) const {
    auto line = MakeRef<CardinalSplinePolyLine>(std::move(pts));
    CopySettingsTo(*line);
    line->tension = tension;
    return line;
}

Ref<Parameter> PolyLine::Copy() const { return WithPoints(points); }

bool PolyLine::BlendsWith(const Parameter &other) const {
    auto *o = dynamic_cast<const PolyLine *>(&other);
    return o && o->DataType() == DataType() && o->points.size() == points.size();
}

Ref<Parameter> PolyLine::Interpolate(const Parameter &other, double t) const {
    // Lines of different point counts do not blend: the earlier key's shape holds.
    if (!BlendsWith(other)) return Ref<Parameter>(const_cast<PolyLine *>(this));
    const Parameter *values[2] = {this, &other};
    const double weights[2] = {1.0 - t, t};
    return WeightedSum(values, weights, 2);
}

Ref<Parameter> PolyLine::WeightedSum(const Parameter *const *values, const double *weights, size_t count) const {
    for (size_t k = 0; k < count; ++k)
        if (!BlendsWith(*values[k])) return nullptr;
    std::vector<PolyPoint> pts = points; // marks, flags and straight marks from this line
    for (size_t i = 0; i < pts.size(); ++i) {
        PolyPoint &p = pts[i];
        p.x = p.y = p.z = p.leftX = p.leftY = p.rightX = p.rightY = p.weight = 0.0;
        for (size_t k = 0; k < count; ++k) {
            const PolyPoint &q = static_cast<const PolyLine *>(values[k])->points[i];
            const double w = weights[k];
            p.x += w * q.x, p.y += w * q.y, p.z += w * q.z;
            p.leftX += w * q.leftX, p.leftY += w * q.leftY, p.rightX += w * q.rightX, p.rightY += w * q.rightY;
            p.weight += w * q.weight;
        }
        p.weight = std::max(p.weight, kMinWeight);
    }
    return WithPoints(std::move(pts));
}

// ---- data types ----

OvID PolyLine::DataType() const { return CLSID_DataType_Polyline; }
OvID BSplinePolyLine::DataType() const { return CLSID_DataType_BSplinePolyline; }
OvID CardinalSplinePolyLine::DataType() const { return CLSID_DataType_CardinalSplinePolyline; }

bool PolyLine::IsPolyLineType(OvID t) {
    return t == CLSID_DataType_Polyline || t == CLSID_DataType_BSplinePolyline ||
           t == CLSID_DataType_CardinalSplinePolyline;
}

Ref<PolyLine> PolyLine::MakeOfType(OvID t) {
    if (t == CLSID_DataType_Polyline) return MakeRef<PolyLine>();
    if (t == CLSID_DataType_BSplinePolyline) return MakeRef<BSplinePolyLine>();
    if (t == CLSID_DataType_CardinalSplinePolyline) return MakeRef<CardinalSplinePolyLine>();
    return nullptr;
}

// ---- document form ----
//
//   Polyline { "x y [H rx ry | L lx ly R rx ry] [Z z] [W w] [F flags] [S]", ..., Closed = true }
//
// One text record per point keeps a point on one line whatever its numbers.

namespace {

void AppendNumber(std::string &out, double v) {
    char buf[32];
    const auto res = std::to_chars(buf, buf + sizeof buf, v);
    out.append(buf, res.ptr);
}

void AppendField(std::string &out, char tag, double a) {
    out += ' ';
    out += tag;
    out += ' ';
    AppendNumber(out, a);
}

void AppendPair(std::string &out, char tag, double a, double b) {
    AppendField(out, tag, a);
    out += ' ';
    AppendNumber(out, b);
}

std::string PointRecord(const PolyPoint &p) {
    std::string out;
    AppendNumber(out, p.x);
    out += ' ';
    AppendNumber(out, p.y);
    const bool hasRight = p.rightX != 0 || p.rightY != 0, hasLeft = p.leftX != 0 || p.leftY != 0;
    if (hasRight && p.leftX == -p.rightX && p.leftY == -p.rightY) {
        AppendPair(out, 'H', p.rightX, p.rightY);
    } else {
        if (hasLeft) AppendPair(out, 'L', p.leftX, p.leftY);
        if (hasRight) AppendPair(out, 'R', p.rightX, p.rightY);
    }
    if (p.z != 0) AppendField(out, 'Z', p.z);
    if (p.weight != 1) AppendField(out, 'W', p.weight);
    if (p.flags) AppendField(out, 'F', p.flags);
    if (p.straight) out += " S";
    return out;
}

/// Reads one point record; false with `problem` and the byte offset `at` of the bad field.
class RecordReader {
public:
    explicit RecordReader(std::string_view text) : text_(text) {}

    bool Read(PolyPoint &p, std::string &problem, size_t &at) {
        if (!Number(p.x, "x", problem, at) || !Number(p.y, "y", problem, at)) return false;
        std::string seen;
        while (Skip()) {
            at = pos_;
            const char tag = text_[pos_];
            if (pos_ + 1 < text_.size() && text_[pos_ + 1] != ' ') {
                problem = "unknown field '" + std::string(Word()) + "' (expected H, L, R, Z, W, F or S)";
                return false;
            }
            if (seen.find(tag) != std::string::npos || (tag == 'H' && seen.find_first_of("LR") != std::string::npos) ||
                ((tag == 'L' || tag == 'R') && seen.find('H') != std::string::npos)) {
                problem = std::string("field ") + tag + " given twice (H stands for both handles)";
                return false;
            }
            seen += tag;
            ++pos_;
            double a = 0, b = 0;
            switch (tag) {
            case 'H':
                if (!Number(a, "handle x", problem, at) || !Number(b, "handle y", problem, at)) return false;
                p.rightX = a, p.rightY = b, p.leftX = -a, p.leftY = -b;
                break;
            case 'L':
            case 'R':
                if (!Number(a, "handle x", problem, at) || !Number(b, "handle y", problem, at)) return false;
                (tag == 'L' ? p.leftX : p.rightX) = a;
                (tag == 'L' ? p.leftY : p.rightY) = b;
                break;
            case 'Z':
                if (!Number(p.z, "z", problem, at)) return false;
                break;
            case 'W':
                if (!Number(p.weight, "weight", problem, at)) return false;
                if (!(p.weight > 0)) return Fail("the weight must be above 0", problem, at);
                break;
            case 'F':
                if (!Number(a, "flags", problem, at)) return false;
                if (a < 0 || a > double(UINT32_MAX) || a != std::floor(a))
                    return Fail("flags must be a whole number from 0 to 4294967295", problem, at);
                p.flags = uint32_t(a);
                break;
            case 'S': p.straight = true; break;
            default:
                problem = std::string("unknown field '") + tag + "' (expected H, L, R, Z, W, F or S)";
                return false;
            }
        }
        return true;
    }

private:
    std::string_view text_;
    size_t pos_ = 0, wordStart_ = 0;

    /// Skips spaces; false at the end.
    bool Skip() {
        while (pos_ < text_.size() && text_[pos_] == ' ') ++pos_;
        return pos_ < text_.size();
    }
    std::string_view Word() {
        Skip();
        wordStart_ = pos_;
        while (pos_ < text_.size() && text_[pos_] != ' ') ++pos_;
        return text_.substr(wordStart_, pos_ - wordStart_);
    }
    bool Fail(const std::string &message, std::string &problem, size_t &at) {
        problem = message;
        at = wordStart_;
        return false;
    }
    bool Number(double &v, const char *what, std::string &problem, size_t &at) {
        const std::string_view w = Word();
        if (w.empty()) return Fail(std::string("missing ") + what, problem, at);
        const auto res = std::from_chars(w.data(), w.data() + w.size(), v);
        if (res.ec != std::errc() || res.ptr != w.data() + w.size() || !std::isfinite(v))
            return Fail(std::string(what) + " '" + std::string(w) + "' is not a finite number", problem, at);
        return true;
    }
};

/// " (line L, column C)" of a value read from text, `offset` characters into it.
std::string Place(const ScriptVal &v, size_t offset = 0) {
    if (v.Line() <= 0) return {};
    return " (line " + std::to_string(v.Line()) + ", column " + std::to_string(v.Column() + int(offset)) + ")";
}

} // namespace

ScriptVal PolyLine::ToScript() const {
    std::vector<ScriptVal::Entry> entries;
    entries.reserve(points.size() + 3);
    for (size_t i = 0; i < points.size(); ++i) entries.emplace_back(ScriptVal(double(i + 1)), PointRecord(points[i]));
    if (closed) entries.emplace_back(ScriptVal("Closed"), ScriptVal(true));
    if (aspect != 1) entries.emplace_back(ScriptVal("Aspect"), ScriptVal(aspect));
    if (auto *c = dynamic_cast<const CardinalSplinePolyLine *>(this); c && c->tension != 0.5)
        entries.emplace_back(ScriptVal("Tension"), ScriptVal(c->tension));
    return ScriptVal::TableOf(DataType().Text(), std::move(entries));
}

Ref<PolyLine> PolyLine::FromScript(OvID type, const ScriptVal &v, std::string &problem) {
    Ref<PolyLine> line = MakeOfType(type);
    if (!line) {
        problem = "not a polyline type";
        return nullptr;
    }
    const std::string form = std::string(type.Text()) + " { \"x y\", ... }";
    if (!v.IsTable() || v.ClassName() != type.Text()) {
        problem = "expects " + form + ", got " +
                  (v.IsTable() && !v.ClassName().empty() ? v.ClassName() + " { ... }" : v.ToText().substr(0, 60));
        return nullptr;
    }
    auto *cardinal = dynamic_cast<CardinalSplinePolyLine *>(line.Get());
    const size_t count = v.ArrayLength();
    line->points.resize(count);
    for (size_t i = 1; i <= count; ++i) {
        const ScriptVal &record = *v.At(i);
        const std::string where = "point " + std::to_string(i);
        if (!record.IsText()) {
            problem = where + Place(record) + ": expects a text \"x y ...\", got " + record.ToText().substr(0, 60);
            return nullptr;
        }
        size_t at = 0;
        std::string what;
        if (!RecordReader(record.AsText()).Read(line->points[i - 1], what, at)) {
            problem = where + Place(record, 1 + at) + ": " + what; // the record starts after its quote
            return nullptr;
        }
    }
    for (const auto &[key, value] : v.Entries()) {
        if (key.IsNumber() && key.AsNumber() >= 1 && key.AsNumber() <= double(count) &&
            key.AsNumber() == std::floor(key.AsNumber()))
            continue;
        const std::string name = key.IsText() ? key.AsText() : key.ToText();
        if (name == "Closed" && value.IsBool()) {
            line->closed = value.AsBool();
        } else if (name == "Aspect" && value.IsNumber() && std::isfinite(value.AsNumber()) && value.AsNumber() > 0) {
            line->aspect = value.AsNumber();
        } else if (name == "Tension" && cardinal && value.IsNumber() && std::isfinite(value.AsNumber())) {
            cardinal->tension = value.AsNumber();
        } else {
            const bool known = name == "Closed" || name == "Aspect" || (name == "Tension" && cardinal);
            const char *expects = name == "Closed"   ? "expects true or false"
                                  : name == "Aspect" ? "expects a finite number above 0"
                                                     : "expects a finite number";
            problem = known ? name + Place(value) + ": " + expects + ", got " + value.ToText().substr(0, 60)
                            : "unknown entry " + name + Place(key) + " (expected point records, Closed, Aspect" +
                                  (cardinal ? ", Tension)" : ")");
            return nullptr;
        }
    }
    return line;
}

} // namespace Orvane
