#pragma once
// The distortion functions of the lens-model kit and their inversion.
//
// A distortion maps a point (x, y) in unit coordinates to (X, Y) and gives its
// Jacobian analytically. generic_distortion_base inverts any of them either by
// fixed-point iteration or by Newton's method from a start value; the Newton
// round counters are diagnostics only.
//
// Extenders are the linear parts of a model's chain: each holds a 2x2 matrix
// and its inverse.
//
// Thread safety: evaluation and inversion are const and may run on many threads
// at once once the coefficients are set; the iteration counters are relaxed
// atomics written by all of them. Setting coefficients is not thread safe.
#include <array>
#include <atomic>

#include "operators/warp/ldpk/LdpkTypes.h"

namespace Orvane::ldpk {

class generic_distortion_base {
public:
    virtual ~generic_distortion_base() = default;
    virtual vec2d eval(vec2d p) const = 0;
    virtual mat2d jacobian(vec2d p) const = 0;
    virtual int get_num_parameters() const = 0;
    virtual void set_coeff(int i, double value) = 0;
    virtual double get_coeff(int i) const = 0;
    /// Derivative of the result by the parameters; the kit's models do not provide it.
    virtual bool derive(double *dg, int n_parameters, vec2d p) const;

    /// Fixed-point inverse of eval at q: p = p + q - f(p) until |f(p) - q| < epsilon,
    /// then the post iterations. False when it did not get below epsilon.
    bool map_inverse(vec2d q, vec2d &p) const;
    /// Newton's inverse of eval at q from `start`, with the analytic Jacobian.
    /// False when the residual did not get below the Newton tolerance.
    bool map_inverse_newton(vec2d q, vec2d start, vec2d &p) const;
    /// Records one Newton inversion in the counters: its rounds and, when it did not converge, its residual.
    void note_newton(int rounds, double residual) const;

    double epsilon() const { return epsilon_; }
    int max_iterations() const { return max_iterations_; }
    int post_iterations() const { return post_iterations_; }
    /// Rounds of the last Newton inversion and the most seen since the last reset.
    int iterations() const { return n_iterations_.load(std::memory_order_relaxed); }
    int largest_iterations() const { return n_max_iterations_.load(std::memory_order_relaxed); }
    /// The residual left by the last inversion that did not converge (0 until one fails). Converging calls
    /// leave it alone, so the many calls of a frame write nothing shared.
    double last_error() const { return last_error_.load(std::memory_order_relaxed); }
    void reset_counters() const {
        n_iterations_.store(0, std::memory_order_relaxed);
        n_max_iterations_.store(0, std::memory_order_relaxed);
        last_error_.store(0.0, std::memory_order_relaxed);
    }

    static constexpr int newton_max_rounds = 20;
    static constexpr double newton_tolerance = 1e-8;

private:
    double epsilon_ = 1e-6;
    int max_iterations_ = 20;
    int post_iterations_ = 2;
    // On a cache line of their own: the coefficients that every worker reads stay off the line they write.
    alignas(64) mutable std::atomic<int> n_iterations_{0};
    mutable std::atomic<int> n_max_iterations_{0};
    mutable std::atomic<double> last_error_{0.0};
};

/// Newton's inverse of `poly`'s eval at q from `start`: each round adds J^-1 (q - f(p)) to p, and the rounds end
/// once |q - f(p)| (taken before the step) is below the tolerance, or after newton_max_rounds. With Poly a final
/// class the calls in the loop are bound at compile time and inlined.
template <class Poly> bool newton_inverse(const Poly &poly, vec2d q, vec2d start, vec2d &p) {
    p = start;
    double e = 0.0;
    int rounds = 0;
    while (rounds < generic_distortion_base::newton_max_rounds) {
        const vec2d d = q - poly.eval(p);
        e = d.norm();
        p = p + poly.jacobian(p).inverse() * d;
        ++rounds;
        if (e < generic_distortion_base::newton_tolerance) break;
    }
    poly.note_newton(rounds, e);
    return e < generic_distortion_base::newton_tolerance;
}

/// Coefficients held in a fixed array, set by index.
template <int N> class coefficient_distortion : public generic_distortion_base {
public:
    int get_num_parameters() const override { return N; }
    void set_coeff(int i, double value) override {
        if (i >= 0 && i < N) c_[i] = value;
    }
    double get_coeff(int i) const override { return i >= 0 && i < N ? c_[i] : 0.0; }

protected:
    std::array<double, N> c_{};
};

/// K = 1 + c2 r2 + c4 r2^2 + c6 r2^3 + c8 r2^4; (X, Y) = K (x, y). Coefficients c2, c4, c6, c8.
class generic_radial_distortion final : public coefficient_distortion<4> {
public:
    vec2d eval(vec2d p) const override;
    mat2d jacobian(vec2d p) const override;
    bool derive(double *dg, int n_parameters, vec2d p) const override;
};

/// Radial degree 4 with decentering; coefficients c2, u1, v1, c4, u3, v3.
class radial_decentered_distortion final : public coefficient_distortion<6> {
public:
    vec2d eval(vec2d p) const override;
    mat2d jacobian(vec2d p) const override;
    bool derive(double *dg, int n_parameters, vec2d p) const override;
};

/// The classic mixed model; parameters ld (distortion), sq (squeeze), cx, cy (curvature), qu (quartic).
/// Its polynomial coefficients are derived from these by prepare(); every parameter change
/// marks them stale, and a stale set is derived on the spot (without storing) when evaluated.
class classic_3de_mixed_distortion final : public coefficient_distortion<5> {
public:
    classic_3de_mixed_distortion() { c_[1] = 1.0; }
    void set_coeff(int i, double value) override;
    void prepare();
    vec2d eval(vec2d p) const override;
    mat2d jacobian(vec2d p) const override;

    struct derived {
        double cxx, cxy, cyx, cyy, cxxx, cxxy, cxyy, cyxx, cyyx, cyyy;
    };
    derived coefficients() const { return ready_ ? d_ : derive_from(c_); }

private:
    static derived derive_from(const std::array<double, 5> &c);
    derived d_{};
    bool ready_ = false;
};

/// X = x (1 + a20 x^2 + a02 y^2 + a40 x^4 + a22 x^2 y^2 + a04 y^4 [+ a60 x^6 + a42 x^4 y^2 + a24 x^2 y^4
/// + a06 y^6]), Y the same with b. The coefficients are a20, a02, a40, a22, a04 (and a60, a42, a24, a06),
/// then the b set in the same order; set_from_terms derives them from the Cx and Cy terms.
template <int Degree> class generic_anamorphic_distortion final : public coefficient_distortion<Degree == 4 ? 10 : 18> {
    static_assert(Degree == 4 || Degree == 6);

public:
    static constexpr int per_axis = Degree == 4 ? 5 : 9;
    /// cx, cy: Cx02, Cx22, Cx04, Cx24, Cx44 (then Cx06, Cx26, Cx46, Cx66 at degree 6).
    void set_from_terms(const double *cx, const double *cy);
    vec2d eval(vec2d p) const override;
    mat2d jacobian(vec2d p) const override;
};

// The polynomials' evaluations run for every pixel and every Newton round: they are inline.
inline vec2d generic_radial_distortion::eval(vec2d p) const {
    const double r2 = p.norm2();
    const double k = 1.0 + r2 * (c_[0] + r2 * (c_[1] + r2 * (c_[2] + r2 * c_[3])));
    return k * p;
}

inline mat2d generic_radial_distortion::jacobian(vec2d p) const {
    const double r2 = p.norm2();
    const double k = 1.0 + r2 * (c_[0] + r2 * (c_[1] + r2 * (c_[2] + r2 * c_[3])));
    const double dk = 2.0 * (c_[0] + r2 * (2.0 * c_[1] + r2 * (3.0 * c_[2] + r2 * 4.0 * c_[3]))); // dK/dr2 x 2
    return {k + dk * p.x * p.x, dk * p.x * p.y, dk * p.x * p.y, k + dk * p.y * p.y};
}

inline vec2d radial_decentered_distortion::eval(vec2d p) const {
    const auto &[c2, u1, v1, c4, u3, v3] = c_;
    const double x = p.x, y = p.y, r2 = p.norm2();
    const double k = 1.0 + r2 * (c2 + r2 * c4), a = u1 + u3 * r2, b = v1 + v3 * r2;
    return {k * x + (r2 + 2 * x * x) * a + 2 * x * y * b, k * y + (r2 + 2 * y * y) * b + 2 * x * y * a};
}

inline mat2d radial_decentered_distortion::jacobian(vec2d p) const {
    const auto &[c2, u1, v1, c4, u3, v3] = c_;
    const double x = p.x, y = p.y, r2 = p.norm2();
    const double k = 1.0 + r2 * (c2 + r2 * c4), kr = c2 + 2.0 * r2 * c4;
    const double a = u1 + u3 * r2, b = v1 + v3 * r2;
    const double px = r2 + 2 * x * x, py = r2 + 2 * y * y;
    return {k + 2 * x * x * kr + 6 * x * a + 2 * x * px * u3 + 2 * y * b + 4 * x * x * y * v3,
            2 * x * y * kr + 2 * y * a + 2 * y * px * u3 + 2 * x * b + 4 * x * y * y * v3,
            2 * x * y * kr + 2 * x * b + 2 * x * py * v3 + 2 * y * a + 4 * x * x * y * u3,
            k + 2 * y * y * kr + 6 * y * b + 2 * y * py * v3 + 2 * x * a + 4 * x * y * y * u3};
}

namespace detail {
// Exponents of x and y of each anamorphic term, in coefficient order.
constexpr int term_x[9] = {2, 0, 4, 2, 0, 6, 4, 2, 0};
constexpr int term_y[9] = {0, 2, 0, 2, 4, 0, 2, 4, 6};
} // namespace detail

template <int Degree> inline vec2d generic_anamorphic_distortion<Degree>::eval(vec2d p) const {
    double xp[7] = {1, p.x, 0, 0, 0, 0, 0}, yp[7] = {1, p.y, 0, 0, 0, 0, 0};
    for (int i = 2; i <= Degree; ++i) xp[i] = xp[i - 1] * p.x, yp[i] = yp[i - 1] * p.y;
    double px = 1.0, py = 1.0;
    for (int k = 0; k < per_axis; ++k) {
        const double m = xp[detail::term_x[k]] * yp[detail::term_y[k]];
        px += this->c_[k] * m;
        py += this->c_[per_axis + k] * m;
    }
    return {p.x * px, p.y * py};
}

template <int Degree> inline mat2d generic_anamorphic_distortion<Degree>::jacobian(vec2d p) const {
    double xp[7] = {1, p.x, 0, 0, 0, 0, 0}, yp[7] = {1, p.y, 0, 0, 0, 0, 0};
    for (int i = 2; i <= Degree; ++i) xp[i] = xp[i - 1] * p.x, yp[i] = yp[i - 1] * p.y;
    // X = x P(x, y): dX/dx = P + x dP/dx = 1 + sum a (1 + i) x^i y^j, dX/dy = x dP/dy.
    mat2d j{1.0, 0.0, 0.0, 1.0};
    for (int k = 0; k < per_axis; ++k) {
        const int ex = detail::term_x[k], ey = detail::term_y[k];
        const double a = this->c_[k], b = this->c_[per_axis + k], m = xp[ex] * yp[ey];
        j.m00 += a * (1 + ex) * m;
        j.m11 += b * (1 + ey) * m;
        if (ey > 0) j.m01 += a * ey * xp[ex + 1] * yp[ey - 1];
        if (ex > 0) j.m10 += b * ex * xp[ex - 1] * yp[ey + 1];
    }
    return j;
}

extern template class generic_anamorphic_distortion<4>;
extern template class generic_anamorphic_distortion<6>;

class extender_base {
public:
    vec2d eval(vec2d p) const { return m_ * p; }
    vec2d eval_inv(vec2d p) const { return inv_ * p; }
    const mat2d &matrix() const { return m_; }
    const mat2d &inverse() const { return inv_; }

protected:
    void set_matrix(const mat2d &m) {
        m_ = m;
        inv_ = m.inverse();
    }

private:
    mat2d m_, inv_;
};

class linear_extender : public extender_base {
public:
    void set(const mat2d &m) { set_matrix(m); }
};

/// Rotation by an angle given in degrees.
class rotation_extender : public extender_base {
public:
    void set(double degrees);
};

class squeeze_x_extender : public extender_base {
public:
    void set(double s) { set_matrix({s, 0.0, 0.0, 1.0}); }
};

class squeeze_y_extender : public extender_base {
public:
    void set(double s) { set_matrix({1.0, 0.0, 0.0, s}); }
};

/// Cylindric bending b along the direction phi (degrees).
class cylindric_extender_2 : public extender_base {
public:
    void set(double phi_degrees, double b);
};

/// The fisheye (equisolid) to perspective radius mapping, f the focal length in unit coordinates.
/// The ratio r / 2f stops at fisheye_ratio_limit, the angle at fisheye_angle_limit and the
/// resulting radius at fisheye_radius_limit, so that the edge of a wide fisheye stays finite.
constexpr double fisheye_ratio_limit = 0.9999;
constexpr double fisheye_angle_limit = 1.5707863267948965;
constexpr double fisheye_radius_limit = 5.0;
vec2d fisheye_to_perspective(vec2d p, double f);
/// The inverse: radius 2 f sin(atan2(r, f) / 2).
vec2d perspective_to_fisheye(vec2d p, double f);
/// Jacobian of fisheye_to_perspective; false (and the identity) where the mapping is at or near
/// its limits, false and the zero matrix where the entries grow beyond use.
bool fisheye_to_perspective_jacobian(vec2d p, double f, mat2d &j);

} // namespace Orvane::ldpk
