// The distortion polynomials, their Jacobians, the two inversions, the extenders and the fisheye mapping.
#include "operators/warp/ldpk/Distortions.h"

#include <algorithm>
#include <cstdio>
#include <numbers>

namespace Orvane::ldpk {

namespace {
// Workers on many rows update the counters of one model at once. Each store is made only when it changes the
// value, so in the common case (the same count as before) the shared line is only read, not bounced between cores.
void remember_rounds(std::atomic<int> &present, std::atomic<int> &largest, int rounds) {
    if (present.load(std::memory_order_relaxed) != rounds) present.store(rounds, std::memory_order_relaxed);
    int seen = largest.load(std::memory_order_relaxed);
    while (rounds > seen && !largest.compare_exchange_weak(seen, rounds, std::memory_order_relaxed)) {
    }
}

double radians(double degrees) { return degrees * (std::numbers::pi / 180.0); }
} // namespace

bool generic_distortion_base::derive(double *, int, vec2d) const {
    std::fputs("ldpk::generic_distortion_base::derive: not implemented\n", stderr);
    return false;
}

bool generic_distortion_base::map_inverse(vec2d q, vec2d &p) const {
    p = q - (eval(q) - q);
    double e = 0.0;
    for (int i = 0; i < max_iterations_; ++i) {
        const vec2d f = eval(p);
        e = (f - q).norm();
        p = p + q - f;
        if (e < epsilon_) break;
    }
    for (int i = 0; i < post_iterations_; ++i) p = p + q - eval(p);
    if (e >= epsilon_) last_error_.store(e, std::memory_order_relaxed);
    return e < epsilon_;
}

bool generic_distortion_base::map_inverse_newton(vec2d q, vec2d start, vec2d &p) const {
    return newton_inverse(*this, q, start, p);
}

void generic_distortion_base::note_newton(int rounds, double residual) const {
    remember_rounds(n_iterations_, n_max_iterations_, rounds);
    if (residual >= newton_tolerance) last_error_.store(residual, std::memory_order_relaxed);
}

bool generic_radial_distortion::derive(double *dg, int n_parameters, vec2d p) const {
    if (n_parameters != 4) {
        std::fputs("example_radial_distortion: n_parameters out of range\n", stderr);
        return false;
    }
    const double r2 = p.norm2();
    double rn = r2;
    for (int i = 0; i < 4; ++i, rn *= r2) {
        dg[2 * i] = rn * p.x;
        dg[2 * i + 1] = rn * p.y;
    }
    return true;
}

bool radial_decentered_distortion::derive(double *dg, int n_parameters, vec2d p) const {
    if (n_parameters != 6) {
        std::fputs("radial_decentered_distortion: n_parameters out of range\n", stderr);
        return false;
    }
    const double x = p.x, y = p.y, r2 = p.norm2();
    const double d[12] = {
        r2 * x,      r2 * y,      r2 + 2 * x * x,        2 * x * y,      2 * x * y,      r2 + 2 * y * y,
        r2 * r2 * x, r2 * r2 * y, r2 * (r2 + 2 * x * x), r2 * 2 * x * y, r2 * 2 * x * y, r2 * (r2 + 2 * y * y)};
    std::copy(d, d + 12, dg);
    return true;
}

void classic_3de_mixed_distortion::set_coeff(int i, double value) {
    coefficient_distortion<5>::set_coeff(i, value);
    ready_ = false;
}

void classic_3de_mixed_distortion::prepare() {
    d_ = derive_from(c_);
    ready_ = true;
}

classic_3de_mixed_distortion::derived classic_3de_mixed_distortion::derive_from(const std::array<double, 5> &c) {
    const auto &[ld, sq, cx, cy, qu] = c;
    return {ld / sq, (ld + cx) / sq, ld + cy, ld, qu / sq, 2 * qu / sq, qu / sq, qu, 2 * qu, qu};
}

vec2d classic_3de_mixed_distortion::eval(vec2d p) const {
    const derived d = coefficients();
    const double x2 = p.x * p.x, y2 = p.y * p.y;
    return {p.x * (1 + d.cxx * x2 + d.cxy * y2 + d.cxxx * x2 * x2 + d.cxxy * x2 * y2 + d.cxyy * y2 * y2),
            p.y * (1 + d.cyx * x2 + d.cyy * y2 + d.cyxx * x2 * x2 + d.cyyx * x2 * y2 + d.cyyy * y2 * y2)};
}

mat2d classic_3de_mixed_distortion::jacobian(vec2d p) const {
    const derived d = coefficients();
    const double x = p.x, y = p.y, x2 = x * x, y2 = y * y;
    return {1 + 3 * d.cxx * x2 + d.cxy * y2 + 5 * d.cxxx * x2 * x2 + 3 * d.cxxy * x2 * y2 + d.cxyy * y2 * y2,
            x * y * (2 * d.cxy + 2 * d.cxxy * x2 + 4 * d.cxyy * y2),
            x * y * (2 * d.cyx + 4 * d.cyxx * x2 + 2 * d.cyyx * y2),
            1 + d.cyx * x2 + 3 * d.cyy * y2 + d.cyxx * x2 * x2 + 3 * d.cyyx * x2 * y2 + 5 * d.cyyy * y2 * y2};
}

template <int Degree> void generic_anamorphic_distortion<Degree>::set_from_terms(const double *cx, const double *cy) {
    for (int axis = 0; axis < 2; ++axis) {
        const double *c = axis == 0 ? cx : cy;
        double *a = this->c_.data() + axis * per_axis;
        a[0] = c[0] + c[1];
        a[1] = c[0] - c[1];
        a[2] = c[2] + c[3] + c[4];
        a[3] = 2 * c[2] - 6 * c[4];
        a[4] = c[2] - c[3] + c[4];
        if constexpr (Degree == 6) {
            a[5] = c[5] + c[6] + c[7] + c[8];
            a[6] = 3 * c[5] + c[6] - 5 * c[7] - 15 * c[8];
            a[7] = 3 * c[5] - c[6] - 5 * c[7] + 15 * c[8];
            a[8] = c[5] - c[6] + c[7] - c[8];
        }
    }
}

template class generic_anamorphic_distortion<4>;
template class generic_anamorphic_distortion<6>;

void rotation_extender::set(double degrees) {
    const double c = std::cos(radians(degrees)), s = std::sin(radians(degrees));
    set_matrix({c, -s, s, c});
}

void cylindric_extender_2::set(double phi_degrees, double b) {
    const double q = std::sqrt(1.0 + b), c = std::cos(radians(phi_degrees)), s = std::sin(radians(phi_degrees));
    const double off = (q - 1.0 / q) * c * s;
    set_matrix({c * c * q + s * s / q, off, off, c * c / q + s * s * q});
}

namespace {
struct fisheye_radius {
    double ratio, angle, radius;
    bool radius_cut;
};

fisheye_radius perspective_radius(double r, double f) {
    fisheye_radius m{r / (2.0 * f), 0.0, 0.0, false};
    if (m.ratio >= 1.0) m.ratio = fisheye_ratio_limit;
    m.angle = 2.0 * std::asin(m.ratio);
    if (m.angle >= std::numbers::pi / 2) m.angle = fisheye_angle_limit;
    m.radius = f * std::tan(m.angle);
    if (m.radius > fisheye_radius_limit) m.radius = fisheye_radius_limit, m.radius_cut = true;
    return m;
}
} // namespace

vec2d fisheye_to_perspective(vec2d p, double f) {
    const double r = p.norm();
    if (r == 0.0) return p;
    return (perspective_radius(r, f).radius / r) * p;
}

vec2d perspective_to_fisheye(vec2d p, double f) {
    const double r = p.norm();
    if (r == 0.0) return p;
    return (2.0 * f * std::sin(std::atan2(r, f) * 0.5) / r) * p;
}

bool fisheye_to_perspective_jacobian(vec2d p, double f, mat2d &j) {
    constexpr double angle_limit = 1.5550883635269477, ratio_limit = 0.99;
    const double r = p.norm();
    j = mat2d{};
    if (r == 0.0) return true;
    const fisheye_radius m = perspective_radius(r, f);
    if (m.angle > angle_limit || m.ratio > ratio_limit) return false;
    // g(p) = s p with s = R / r: J = s I + (R' - s) p p^T / r^2.
    const double s = m.radius / r, c = std::cos(m.angle);
    const double dr = m.radius_cut ? 0.0 : 1.0 / (c * c * std::sqrt(1.0 - m.ratio * m.ratio));
    const double w = (dr - s) / (r * r);
    j = {s + w * p.x * p.x, w * p.x * p.y, w * p.x * p.y, s + w * p.y * p.y};
    if (j.m00 * j.m00 + j.m01 * j.m01 + j.m10 * j.m10 + j.m11 * j.m11 > 100.0) {
        j = mat2d::zero();
        return false;
    }
    return true;
}

} // namespace Orvane::ldpk
