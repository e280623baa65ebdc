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

    double epsilon() const { return epsilon_; }
    int max_iterations() const { return max_iterations_; }
    int post_iterations() const { return post_iterations_; }
    /// Rounds of the last Newton inversion and the most seen since the last reset.
    int iterations() const { return n_iterations_.load(std::memory_order_relaxed); }
    int largest_iterations() const { return n_max_iterations_.load(std::memory_order_relaxed); }
    double last_error() const { return last_error_.load(std::memory_order_relaxed); }
    void reset_counters() const {
        n_iterations_.store(0, std::memory_order_relaxed);
        n_max_iterations_.store(0, std::memory_order_relaxed);
    }

    static constexpr int newton_max_rounds = 20;
    static constexpr double newton_tolerance = 1e-8;

private:
    double epsilon_ = 1e-6;
    int max_iterations_ = 20;
    int post_iterations_ = 2;
    mutable std::atomic<int> n_iterations_{0};
    mutable std::atomic<int> n_max_iterations_{0};
    mutable std::atomic<double> last_error_{0.0};
};

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
class generic_radial_distortion : public coefficient_distortion<4> {
public:
    vec2d eval(vec2d p) const override;
    mat2d jacobian(vec2d p) const override;
    bool derive(double *dg, int n_parameters, vec2d p) const override;
};

/// Radial degree 4 with decentering; coefficients c2, u1, v1, c4, u3, v3.
class radial_decentered_distortion : public coefficient_distortion<6> {
public:
    vec2d eval(vec2d p) const override;
    mat2d jacobian(vec2d p) const override;
    bool derive(double *dg, int n_parameters, vec2d p) const override;
};

/// The classic mixed model; parameters ld (distortion), sq (squeeze), cx, cy (curvature), qu (quartic).
/// Its polynomial coefficients are derived from these by prepare(); every parameter change
/// marks them stale, and a stale set is derived on the spot (without storing) when evaluated.
class classic_3de_mixed_distortion : public coefficient_distortion<5> {
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
template <int Degree> class generic_anamorphic_distortion : public coefficient_distortion<Degree == 4 ? 10 : 18> {
    static_assert(Degree == 4 || Degree == 6);

public:
    static constexpr int per_axis = Degree == 4 ? 5 : 9;
    /// cx, cy: Cx02, Cx22, Cx04, Cx24, Cx44 (then Cx06, Cx26, Cx46, Cx66 at degree 6).
    void set_from_terms(const double *cx, const double *cy);
    vec2d eval(vec2d p) const override;
    mat2d jacobian(vec2d p) const override;
};

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
