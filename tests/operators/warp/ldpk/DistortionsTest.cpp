// The kit's distortion functions against small reference models written here from the formulas (the anamorphic
// terms in their polar form r^k cos(j phi)), their Jacobians against central differences, the extenders, the
// fisheye mapping pair and the two inversions.
#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <numbers>

#include "operators/warp/ldpk/Distortions.h"

namespace Orvane::ldpk {
namespace {

using Map = std::function<vec2d(vec2d)>;

mat2d central_differences(const Map &f, vec2d p, double h = 1e-6) {
    const vec2d dx = (0.5 / h) * (f({p.x + h, p.y}) - f({p.x - h, p.y}));
    const vec2d dy = (0.5 / h) * (f({p.x, p.y + h}) - f({p.x, p.y - h}));
    return {dx.x, dy.x, dx.y, dy.y};
}

double max_difference(const mat2d &a, const mat2d &b) {
    return std::max(
        {std::abs(a.m00 - b.m00), std::abs(a.m01 - b.m01), std::abs(a.m10 - b.m10), std::abs(a.m11 - b.m11)});
}

// Points over the unit disc and a little beyond, off the axes and on them.
std::vector<vec2d> probe_points() {
    std::vector<vec2d> pts;
    for (double x = -1.1; x <= 1.1001; x += 0.275)
        for (double y = -0.9; y <= 0.9001; y += 0.3) pts.push_back({x, y});
    return pts;
}

// Anamorphic reference: X = x (1 + sum Cx_jk r^k cos(j phi)), Y = y (1 + sum Cy_jk r^k cos(j phi)), terms
// (j, k) = 02, 22, 04, 24, 44, 06, 26, 46, 66.
vec2d anamorphic_reference(vec2d p, const double *cx, const double *cy, int n_terms) {
    constexpr int j[9] = {0, 2, 0, 2, 4, 0, 2, 4, 6}, k[9] = {2, 2, 4, 4, 4, 6, 6, 6, 6};
    const double r = p.norm(), phi = std::atan2(p.y, p.x);
    double sx = 1, sy = 1;
    for (int t = 0; t < n_terms; ++t) {
        const double m = std::pow(r, k[t]) * std::cos(j[t] * phi);
        sx += cx[t] * m;
        sy += cy[t] * m;
    }
    return {p.x * sx, p.y * sy};
}

struct PolynomialCase {
    const char *name;
    std::function<std::unique_ptr<generic_distortion_base>()> make;
    Map reference;
};

const double cx[9] = {-0.05, 0.01, 0.012, -0.004, 0.003, 0.002, -0.001, 0.0015, 0.0007};
const double cy[9] = {-0.045, -0.008, 0.009, 0.003, -0.002, -0.001, 0.0012, -0.0006, 0.0009};

std::vector<PolynomialCase> polynomial_cases() {
    return {
        {"radial degree 8",
         [] {
             auto d = std::make_unique<generic_radial_distortion>();
             const double c[4] = {-0.05, 0.01, -0.002, 0.0005};
             for (int i = 0; i < 4; ++i) d->set_coeff(i, c[i]);
             return d;
         },
         [](vec2d p) {
             const double r2 = p.norm2();
             return (1 - 0.05 * r2 + 0.01 * r2 * r2 - 0.002 * std::pow(r2, 3) + 0.0005 * std::pow(r2, 4)) * p;
         }},
        {"radial decentered",
         [] {
             auto d = std::make_unique<radial_decentered_distortion>();
             const double c[6] = {-0.05, 0.002, -0.003, 0.01, 0.001, -0.0015};
             for (int i = 0; i < 6; ++i) d->set_coeff(i, c[i]);
             return d;
         },
         [](vec2d p) {
             // Radial part plus the decentering written as (A, B) . gradient terms.
             const double x = p.x, y = p.y, r2 = p.norm2(), k = 1 - 0.05 * r2 + 0.01 * r2 * r2;
             const double a = 0.002 + 0.001 * r2, b = -0.003 - 0.0015 * r2;
             return vec2d{k * x + a * (3 * x * x + y * y) + 2 * b * x * y,
                          k * y + b * (x * x + 3 * y * y) + 2 * a * x * y};
         }},
        {"classic mixed",
         [] {
             auto d = std::make_unique<classic_3de_mixed_distortion>();
             const double c[5] = {-0.05, 1.1, 0.01, -0.02, 0.008};
             for (int i = 0; i < 5; ++i) d->set_coeff(i, c[i]);
             d->prepare();
             return d;
         },
         [](vec2d p) {
             // X = x (1 + (ld r^2 + cx y^2 + qu r^4) / sq), Y = y (1 + ld r^2 + cy x^2 + qu r^4).
             const double r2 = p.norm2(), ld = -0.05, sq = 1.1, qu = 0.008;
             return vec2d{p.x * (1 + (ld * r2 + 0.01 * p.y * p.y + qu * r2 * r2) / sq),
                          p.y * (1 + ld * r2 - 0.02 * p.x * p.x + qu * r2 * r2)};
         }},
        {"anamorphic degree 4",
         [] {
             auto d = std::make_unique<generic_anamorphic_distortion<4>>();
             d->set_from_terms(cx, cy);
             return d;
         },
         [](vec2d p) { return anamorphic_reference(p, cx, cy, 5); }},
        {"anamorphic degree 6",
         [] {
             auto d = std::make_unique<generic_anamorphic_distortion<6>>();
             d->set_from_terms(cx, cy);
             return d;
         },
         [](vec2d p) { return anamorphic_reference(p, cx, cy, 9); }},
    };
}

TEST(LdpkPolynomials, MatchReferenceJacobianMatchesDifferencesAndBothInversionsInvert) {
    for (const PolynomialCase &c : polynomial_cases()) {
        SCOPED_TRACE(c.name);
        const auto d = c.make();
        const Map f = [&](vec2d p) { return d->eval(p); };
        d->reset_counters();
        for (vec2d p : probe_points()) {
            const vec2d got = d->eval(p), want = c.reference(p);
            EXPECT_NEAR(got.x, want.x, 1e-14) << p.x << " " << p.y;
            EXPECT_NEAR(got.y, want.y, 1e-14) << p.x << " " << p.y;
            EXPECT_LT(max_difference(d->jacobian(p), central_differences(f, p)), 1e-8) << p.x << " " << p.y;

            vec2d back;
            EXPECT_TRUE(d->map_inverse_newton(got, 0.9 * got, back));
            EXPECT_LT((back - p).norm(), 1e-9);
            EXPECT_TRUE(d->map_inverse(got, back));
            EXPECT_LT((back - p).norm(), 1e-6);
        }
        EXPECT_GE(d->largest_iterations(), 2);
        EXPECT_LE(d->largest_iterations(), generic_distortion_base::newton_max_rounds);
    }
}

TEST(LdpkPolynomials, ClassicFollowsChangesMadeAfterPrepare) {
    // A change after prepare() is seen at once: the derived coefficients follow without a new prepare().
    classic_3de_mixed_distortion classic;
    classic.prepare();
    classic.set_coeff(0, 0.1); // ld
    EXPECT_DOUBLE_EQ(classic.eval({0.5, 0}).x, 0.5 * (1 + 0.1 * 0.25));
    EXPECT_DOUBLE_EQ(classic.coefficients().cyx, 0.1);
    classic.set_coeff(1, 2.0); // squeeze halves the X terms
    EXPECT_DOUBLE_EQ(classic.coefficients().cxx, 0.05);
    classic.prepare();
    EXPECT_DOUBLE_EQ(classic.coefficients().cxy, 0.05);
}

TEST(LdpkPolynomials, ParameterDerivativesAndTheirCountChecks) {
    generic_radial_distortion radial;
    radial_decentered_distortion decentered;
    generic_anamorphic_distortion<4> anamorphic;
    for (int i = 0; i < 6; ++i) decentered.set_coeff(i, 0.01 * (i + 1));
    double dg[12];
    const vec2d p{0.4, -0.3};
    // Each derivative by a coefficient against a difference quotient of that coefficient.
    for (generic_distortion_base *d : std::initializer_list<generic_distortion_base *>{&radial, &decentered}) {
        const int n = d->get_num_parameters();
        ASSERT_TRUE(d->derive(dg, n, p));
        for (int i = 0; i < n; ++i) {
            const double c = d->get_coeff(i), h = 1e-6;
            d->set_coeff(i, c + h);
            const vec2d up = d->eval(p);
            d->set_coeff(i, c - h);
            const vec2d down = d->eval(p);
            d->set_coeff(i, c);
            EXPECT_NEAR(dg[2 * i], (up.x - down.x) / (2 * h), 1e-8) << i;
            EXPECT_NEAR(dg[2 * i + 1], (up.y - down.y) / (2 * h), 1e-8) << i;
        }
    }
    const struct {
        generic_distortion_base *d;
        const char *text;
    } refusals[] = {{&radial, "example_radial_distortion: n_parameters out of range\n"},
                    {&decentered, "radial_decentered_distortion: n_parameters out of range\n"},
                    {&anamorphic, "ldpk::generic_distortion_base::derive: not implemented\n"}};
    for (const auto &r : refusals) {
        testing::internal::CaptureStderr();
        EXPECT_FALSE(r.d->derive(dg, 3, p));
        EXPECT_EQ(testing::internal::GetCapturedStderr(), r.text);
    }
}

TEST(LdpkExtenders, MatricesInversesAndInvariants) {
    const double deg = std::numbers::pi / 180;
    rotation_extender rot;
    rot.set(90.0);
    EXPECT_NEAR(rot.eval({1, 0}).x, 0.0, 1e-15);
    EXPECT_NEAR(rot.eval({1, 0}).y, 1.0, 1e-15);

    const struct { double phi, b; } cylinders[] = {{0, 0.05}, {30, -0.08}, {-75, 0.1}, {90, 0.02}, {45, 0}};
    for (const auto &c : cylinders) {
        cylindric_extender_2 cyl;
        cyl.set(c.phi, c.b);
        // A stretch by sqrt(1 + b) along phi and its reciprocal across: area kept, the axis an eigenvector.
        EXPECT_NEAR(cyl.matrix().det(), 1.0, 1e-14);
        const vec2d axis{std::cos(c.phi * deg), std::sin(c.phi * deg)}, across{-axis.y, axis.x};
        const vec2d along = cyl.eval(axis), normal = cyl.eval(across);
        EXPECT_NEAR(along.x, std::sqrt(1 + c.b) * axis.x, 1e-14);
        EXPECT_NEAR(along.y, std::sqrt(1 + c.b) * axis.y, 1e-14);
        EXPECT_NEAR(normal.x, across.x / std::sqrt(1 + c.b), 1e-14);
        EXPECT_NEAR(normal.y, across.y / std::sqrt(1 + c.b), 1e-14);
        const vec2d p{0.3, -0.7}, back = cyl.eval_inv(cyl.eval(p));
        EXPECT_NEAR(back.x, p.x, 1e-15);
        EXPECT_NEAR(back.y, p.y, 1e-15);
    }

    // A squeeze of 0 is singular: its inverse is the zero matrix, not infinities.
    squeeze_x_extender flat;
    flat.set(0.0);
    EXPECT_EQ(flat.eval_inv({1, 1}).x, 0.0);
    EXPECT_EQ(flat.eval_inv({1, 1}).y, 0.0);
}

TEST(LdpkFisheye, EquisolidToPerspectiveAndBackWithItsLimits) {
    for (double f : {0.6, 1.0, 1.8}) {
        SCOPED_TRACE(f);
        const Map map = [f](vec2d p) { return fisheye_to_perspective(p, f); };
        for (vec2d p : probe_points()) {
            const double r = p.norm();
            if (r == 0 || r / (2 * f) > 0.5) continue; // up to 60 degrees off the axis
            // Equisolid: the fisheye radius is 2 f sin(theta / 2), the perspective one f tan(theta).
            const double theta = 2 * std::asin(r / (2 * f));
            const vec2d q = map(p);
            const double want = std::min(f * std::tan(theta), fisheye_radius_limit);
            EXPECT_NEAR(q.norm(), want, 1e-12 * want);
            EXPECT_NEAR(q.x * p.y - q.y * p.x, 0.0, 1e-12); // same direction
            EXPECT_GT(q.x * p.x + q.y * p.y, 0.0);
            const vec2d back = perspective_to_fisheye(q, f);
            if (want < fisheye_radius_limit) {
                EXPECT_NEAR((back - p).norm(), 0.0, 1e-12);
            }
            mat2d j;
            ASSERT_TRUE(fisheye_to_perspective_jacobian(p, f, j));
            EXPECT_LT(max_difference(j, central_differences(map, p, 1e-7)), 1e-6 * (1 + std::abs(j.m00)));
        }
    }
    // The origin stays; beyond the fisheye's reach the ratio and angle stop and the radius is held at 5.
    EXPECT_EQ(fisheye_to_perspective({0, 0}, 1.0).x, 0.0);
    for (double r : {1.95, 2.0, 2.5, 40.0}) {
        const vec2d q = fisheye_to_perspective({0.6 * r, -0.8 * r}, 1.0);
        EXPECT_NEAR(q.norm(), fisheye_radius_limit, 1e-12) << r;
        EXPECT_NEAR(q.x / q.norm(), 0.6, 1e-12) << r;
        mat2d j;
        EXPECT_FALSE(fisheye_to_perspective_jacobian({0.6 * r, -0.8 * r}, 1.0, j)) << r;
        EXPECT_EQ(j.m00, 1.0);
        EXPECT_EQ(j.m01, 0.0);
    }
    // At 86 degrees (theta = 1.5, short of the limit angle, radius 2.8 short of 5) the radial derivative is
    // about 270: beyond use, the zero matrix.
    mat2d j;
    EXPECT_FALSE(fisheye_to_perspective_jacobian({0.4 * std::sin(0.75), 0}, 0.2, j));
    EXPECT_EQ(j.m00, 0.0);
    EXPECT_EQ(j.m11, 0.0);
}

} // namespace
} // namespace Orvane::ldpk
