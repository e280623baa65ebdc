#include "host/image/QuadMap.h"

#include <algorithm>
#include <cmath>
#include <utility>

namespace Orvane {
namespace {

double Cross(double ax, double ay, double bx, double by) { return ax * by - ay * bx; }

/// The largest distance between two of the points: the scale tolerances are relative to.
double Spread(const QuadPoint p[4]) {
    double s = 0.0;
    for (int i = 0; i < 4; ++i)
        for (int j = i + 1; j < 4; ++j) s = std::max(s, std::hypot(p[i].x - p[j].x, p[i].y - p[j].y));
    return s;
}

constexpr double kRelative = 1e-9;

bool ThreeOnALine(const QuadPoint p[4]) {
    const double spread = Spread(p);
    if (!(spread > 0.0) || !std::isfinite(spread)) return true;
    for (int skip = 0; skip < 4; ++skip) {
        const QuadPoint *q[3];
        for (int i = 0, n = 0; i < 4; ++i)
            if (i != skip) q[n++] = &p[i];
        const double area = Cross(q[1]->x - q[0]->x, q[1]->y - q[0]->y, q[2]->x - q[0]->x, q[2]->y - q[0]->y);
        if (std::fabs(area) <= kRelative * spread * spread) return true;
    }
    return false;
}

} // namespace

bool HomographyFromPoints(const QuadPoint from[4], const QuadPoint to[4], Matrix3 &out) {
    out = Matrix3::Identity();
    if (ThreeOnALine(from) || ThreeOnALine(to)) return false;
    // Unknowns h0..h7 with h8 = 1: for each pair (x, y) -> (X, Y),
    //   h0 x + h1 y + h2 - X (h6 x + h7 y) = X
    //   h3 x + h4 y + h5 - Y (h6 x + h7 y) = Y
    // solved by Gaussian elimination with partial pivoting.
    double a[8][9];
    for (int i = 0; i < 4; ++i) {
        const double x = from[i].x, y = from[i].y, X = to[i].x, Y = to[i].y;
        const double r0[9] = {x, y, 1, 0, 0, 0, -X * x, -X * y, X};
        const double r1[9] = {0, 0, 0, x, y, 1, -Y * x, -Y * y, Y};
        std::copy(r0, r0 + 9, a[2 * i]);
        std::copy(r1, r1 + 9, a[2 * i + 1]);
    }
    for (int c = 0; c < 8; ++c) {
        int pivot = c;
        for (int r = c + 1; r < 8; ++r)
            if (std::fabs(a[r][c]) > std::fabs(a[pivot][c])) pivot = r;
        if (!(std::fabs(a[pivot][c]) > 1e-300)) return false;
        if (pivot != c) std::swap(a[pivot], a[c]);
        for (int r = 0; r < 8; ++r) {
            if (r == c) continue;
            const double f = a[r][c] / a[c][c];
            for (int k = c; k < 9; ++k) a[r][k] -= f * a[c][k];
        }
    }
    for (int i = 0; i < 8; ++i) out.m[i] = a[i][8] / a[i][i];
    out.m[8] = 1.0;
    for (double v : out.m)
        if (!std::isfinite(v)) return false;
    return std::fabs(out.Determinant()) > 0.0;
}

bool IsConvexQuad(const QuadPoint p[4]) {
    if (ThreeOnALine(p)) return false;
    int sign = 0;
    for (int i = 0; i < 4; ++i) {
        const QuadPoint &a = p[i], &b = p[(i + 1) % 4], &c = p[(i + 2) % 4];
        const double turn = Cross(b.x - a.x, b.y - a.y, c.x - b.x, c.y - b.y);
        const int s = turn > 0 ? 1 : -1;
        if (sign != 0 && s != sign) return false;
        sign = s;
    }
    return true;
}

bool BilinearQuad::Set(const QuadPoint p[4]) {
    if (!IsConvexQuad(p)) return false;
    a_ = p[0];
    e_ = {p[1].x - p[0].x, p[1].y - p[0].y};
    f_ = {p[3].x - p[0].x, p[3].y - p[0].y};
    g_ = {p[0].x - p[1].x + p[2].x - p[3].x, p[0].y - p[1].y + p[2].y - p[3].y};
    return true;
}

void BilinearQuad::Forward(double s, double t, double &x, double &y) const {
    x = a_.x + e_.x * s + f_.x * t + g_.x * s * t;
    y = a_.y + e_.y * s + f_.y * t + g_.y * s * t;
}

bool BilinearQuad::Inverse(double x, double y, double &s, double &t) const {
    // h = s (e + g t) + f t; crossing with (e + g t) leaves a quadratic in t:
    //   cross(g, f) t^2 + (cross(e, f) + cross(h, g)) t + cross(h, e) = 0.
    const double hx = x - a_.x, hy = y - a_.y;
    const double k2 = Cross(g_.x, g_.y, f_.x, f_.y);
    const double k1 = Cross(e_.x, e_.y, f_.x, f_.y) + Cross(hx, hy, g_.x, g_.y);
    const double k0 = Cross(hx, hy, e_.x, e_.y);
    double roots[2];
    int n = 0;
    if (std::fabs(k2) <= 1e-12 * std::fabs(k1)) {
        if (k1 == 0.0) return false;
        roots[n++] = -k0 / k1;
    } else {
        const double disc = k1 * k1 - 4.0 * k2 * k0;
        if (disc < 0.0) return false;
        // The stable pair of roots (no cancellation).
        const double q = -0.5 * (k1 + std::copysign(std::sqrt(disc), k1));
        roots[n++] = q / k2;
        if (q != 0.0) roots[n++] = k0 / q;
    }
    double best = HUGE_VAL;
    for (int i = 0; i < n; ++i) {
        const double tt = roots[i];
        const double dx = e_.x + g_.x * tt, dy = e_.y + g_.y * tt;
        if (dx == 0.0 && dy == 0.0) continue;
        const double ss = std::fabs(dx) >= std::fabs(dy) ? (hx - f_.x * tt) / dx : (hy - f_.y * tt) / dy;
        // Distance of (ss, tt) from the unit square.
        const double d = std::hypot(std::max({0.0, -ss, ss - 1.0}), std::max({0.0, -tt, tt - 1.0}));
        if (std::isfinite(ss) && d < best) best = d, s = ss, t = tt;
    }
    return best < HUGE_VAL;
}

} // namespace Orvane
