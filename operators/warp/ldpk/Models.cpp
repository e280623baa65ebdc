// The six concrete lens models: parameter lists, chains, inverses and Jacobians; the factory and model IDs.
#include "operators/warp/ldpk/Models.h"

#include <cctype>
#include <cstdio>

namespace Orvane {

using ldpk::mat2d;
using ldpk::parameter_descriptor;
using ldpk::parameter_type;
using ldpk::vec2d;

namespace {
constexpr parameter_type real = parameter_type::real;

#define ORVANE_LDPK_TERM(n)                                                                                            \
    { n, real, 0.0, -0.5, 0.5 }
constexpr parameter_descriptor anamorphic_4_params[] = {
    ORVANE_LDPK_TERM("Cx02 - Degree 2"), ORVANE_LDPK_TERM("Cy02 - Degree 2"),     ORVANE_LDPK_TERM("Cx22 - Degree 2"),
    ORVANE_LDPK_TERM("Cy22 - Degree 2"), ORVANE_LDPK_TERM("Cx04 - Degree 4"),     ORVANE_LDPK_TERM("Cy04 - Degree 4"),
    ORVANE_LDPK_TERM("Cx24 - Degree 4"), ORVANE_LDPK_TERM("Cy24 - Degree 4"),     ORVANE_LDPK_TERM("Cx44 - Degree 4"),
    ORVANE_LDPK_TERM("Cy44 - Degree 4"), {"Lens Rotation", real, 0.0, -2.0, 2.0}, {"Squeeze-X", real, 1.0, 0.9, 1.1},
    {"Squeeze-Y", real, 1.0, 0.9, 1.1}};

constexpr parameter_descriptor anamorphic_6_params[] = {
    ORVANE_LDPK_TERM("Cx02 - Degree 2"), ORVANE_LDPK_TERM("Cy02 - Degree 2"), ORVANE_LDPK_TERM("Cx22 - Degree 2"),
    ORVANE_LDPK_TERM("Cy22 - Degree 2"), ORVANE_LDPK_TERM("Cx04 - Degree 4"), ORVANE_LDPK_TERM("Cy04 - Degree 4"),
    ORVANE_LDPK_TERM("Cx24 - Degree 4"), ORVANE_LDPK_TERM("Cy24 - Degree 4"), ORVANE_LDPK_TERM("Cx44 - Degree 4"),
    ORVANE_LDPK_TERM("Cy44 - Degree 4"), ORVANE_LDPK_TERM("Cx06 - Degree 6"), ORVANE_LDPK_TERM("Cy06 - Degree 6"),
    ORVANE_LDPK_TERM("Cx26 - Degree 6"), ORVANE_LDPK_TERM("Cy26 - Degree 6"), ORVANE_LDPK_TERM("Cx46 - Degree 6"),
    ORVANE_LDPK_TERM("Cy46 - Degree 6"), ORVANE_LDPK_TERM("Cx66 - Degree 6"), ORVANE_LDPK_TERM("Cy66 - Degree 6")};

constexpr parameter_descriptor classic_params[] = {ORVANE_LDPK_TERM("Distortion"),
                                                   {"Anamorphic Squeeze", real, 1.0, 0.25, 4.0},
                                                   ORVANE_LDPK_TERM("Curvature X"),
                                                   ORVANE_LDPK_TERM("Curvature Y"),
                                                   ORVANE_LDPK_TERM("Quartic Distortion")};

constexpr parameter_descriptor radial_4_params[] = {ORVANE_LDPK_TERM("Distortion - Degree 2"),
                                                    ORVANE_LDPK_TERM("U - Degree 2"),
                                                    ORVANE_LDPK_TERM("V - Degree 2"),
                                                    ORVANE_LDPK_TERM("Quartic Distortion - Degree 4"),
                                                    ORVANE_LDPK_TERM("U - Degree 4"),
                                                    ORVANE_LDPK_TERM("V - Degree 4"),
                                                    {"Phi - Cylindric Direction", real, 0.0, -90.0, 90.0},
                                                    {"B - Cylindric Bending", real, 0.0, -0.1, 0.1}};

constexpr parameter_descriptor radial_8_params[] = {ORVANE_LDPK_TERM("Distortion - Degree 2"),
                                                    ORVANE_LDPK_TERM("Quartic Distortion - Degree 4"),
                                                    ORVANE_LDPK_TERM("Degree 6"), ORVANE_LDPK_TERM("Degree 8")};
#undef ORVANE_LDPK_TERM

} // namespace

// ---- anamorphic, degree 4, with lens rotation and squeeze ----

tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy()
    : polynomial_model("3DE4 Anamorphic - Standard, Degree 4", anamorphic_4_params) {}

bool tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::initializeParameters() {
    polynomial_model::initializeParameters();
    if (value(11) == 0.0)
        std::fputs("tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::initializeParameters, error: Squeeze-X is 0.\n",
                   stderr);
    if (value(12) == 0.0)
        std::fputs("tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::initializeParameters, error: Squeeze-Y is 0.\n",
                   stderr);
    return true;
}

void tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::prepare() {
    double cx[5], cy[5];
    for (int k = 0; k < 5; ++k) cx[k] = value(2 * k), cy[k] = value(2 * k + 1);
    poly_.set_from_terms(cx, cy);
    rotation_.set(value(10));
    squeeze_x_.set(value(11));
    squeeze_y_.set(value(12));
    pixel_aspect_.set(pixel_aspect());
    // In: undo the pixel aspect and the rotation (E2 = P R); out: E1 = R Sx Sy P.
    e2_.set(pixel_aspect_.matrix() * rotation_.matrix());
    e1_.set(rotation_.matrix() * squeeze_x_.matrix() * squeeze_y_.matrix() * pixel_aspect_.matrix());
}

vec2d tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::undistort_unit(vec2d p) const {
    return e1_.eval(poly_.eval(e2_.eval_inv(p)));
}

bool tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::distort_unit(vec2d q, vec2d start, vec2d &p) const {
    vec2d inner;
    const bool ok = newton_inverse(poly_, e1_.eval_inv(q), e2_.eval_inv(start), inner);
    p = e2_.eval(inner);
    return ok;
}

bool tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::jacobian_unit(vec2d p, mat2d &j) const {
    j = e1_.matrix() * poly_.jacobian(e2_.eval_inv(p)) * e2_.inverse();
    return true;
}

// ---- anamorphic, degree 6 ----

tde4_ldp_anamorphic_deg_6::tde4_ldp_anamorphic_deg_6()
    : polynomial_model("3DE4 Anamorphic, Degree 6", anamorphic_6_params) {}

void tde4_ldp_anamorphic_deg_6::prepare() {
    double cx[9], cy[9];
    for (int k = 0; k < 9; ++k) cx[k] = value(2 * k), cy[k] = value(2 * k + 1);
    poly_.set_from_terms(cx, cy);
}

// ---- classic ----

tde4_ldp_classic_3de_mixed::tde4_ldp_classic_3de_mixed() : polynomial_model("3DE Classic LD Model", classic_params) {}

void tde4_ldp_classic_3de_mixed::prepare() {
    for (int i = 0; i < 5; ++i) poly_.set_coeff(i, value(i));
    poly_.prepare();
}

// ---- radial decentered, degree 4, cylindric ----

tde4_ldp_radial_decentered_deg_4_cylindric::tde4_ldp_radial_decentered_deg_4_cylindric()
    : polynomial_model("3DE4 Radial - Standard, Degree 4", radial_4_params) {}

void tde4_ldp_radial_decentered_deg_4_cylindric::prepare() {
    for (int i = 0; i < 6; ++i) poly_.set_coeff(i, value(i));
    cylindric_.set(value(6), value(7));
}

vec2d tde4_ldp_radial_decentered_deg_4_cylindric::undistort_unit(vec2d p) const {
    return cylindric_.eval(poly_.eval(p));
}

bool tde4_ldp_radial_decentered_deg_4_cylindric::distort_unit(vec2d q, vec2d start, vec2d &p) const {
    return newton_inverse(poly_, cylindric_.eval_inv(q), start, p);
}

bool tde4_ldp_radial_decentered_deg_4_cylindric::jacobian_unit(vec2d p, mat2d &j) const {
    j = cylindric_.matrix() * poly_.jacobian(p);
    return true;
}

// ---- radial fisheye, degree 8 ----

tde4_ldp_radial_deg_8::tde4_ldp_radial_deg_8() : tde4_ldp_radial_deg_8("3DE4 Radial - Fisheye, Degree 8", true) {}

tde4_ldp_radial_deg_8::tde4_ldp_radial_deg_8(const char *name, bool cut_result)
    : polynomial_model(name, radial_8_params), cut_result_(cut_result) {}

tde4_ldp_radial_deg_8_release_1::tde4_ldp_radial_deg_8_release_1()
    : tde4_ldp_radial_deg_8("3DE4 Radial - Fisheye, Degree 8, Release 1", false) {}

void tde4_ldp_radial_deg_8::prepare() {
    for (int i = 0; i < 4; ++i) poly_.set_coeff(i, value(i));
    f_unit_ = focal_length_cm() / r_fb();
}

vec2d tde4_ldp_radial_deg_8::undistort_unit(vec2d p) const {
    vec2d q = poly_.eval(ldpk::fisheye_to_perspective(p, f_unit_));
    if (cut_result_) {
        const double r = q.norm();
        if (r > result_radius_limit) q = (result_radius_limit / r) * q;
    }
    return q;
}

bool tde4_ldp_radial_deg_8::distort_unit(vec2d q, vec2d start, vec2d &p) const {
    vec2d inner;
    const bool ok = newton_inverse(poly_, q, ldpk::fisheye_to_perspective(start, f_unit_), inner);
    p = ldpk::perspective_to_fisheye(inner, f_unit_);
    return ok;
}

bool tde4_ldp_radial_deg_8::jacobian_unit(vec2d p, mat2d &j) const {
    mat2d mapping;
    if (!ldpk::fisheye_to_perspective_jacobian(p, f_unit_, mapping)) {
        j = mapping;
        return false;
    }
    j = poly_.jacobian(ldpk::fisheye_to_perspective(p, f_unit_)) * mapping;
    return true;
}

// ---- factory and IDs ----

namespace ldpk {

std::vector<std::unique_ptr<ldp_builtin>> make_models() {
    std::vector<std::unique_ptr<ldp_builtin>> models;
    models.push_back(std::make_unique<tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy>());
    models.push_back(std::make_unique<tde4_ldp_anamorphic_deg_6>());
    models.push_back(std::make_unique<tde4_ldp_classic_3de_mixed>());
    models.push_back(std::make_unique<tde4_ldp_radial_decentered_deg_4_cylindric>());
    models.push_back(std::make_unique<tde4_ldp_radial_deg_8>());
    models.push_back(std::make_unique<tde4_ldp_radial_deg_8_release_1>());
    for (auto &m : models) m->initializeParameters();
    return models;
}

std::string model_id(const std::string &name) {
    std::string id;
    for (unsigned char ch : name)
        if (std::isalnum(ch) && !(id.empty() && std::isdigit(ch))) id += static_cast<char>(ch);
    if (id == "DE4RadialFisheyeDegree8") return "DE4RadialFisheyeDegree8Release2";
    if (id == "DE4RadialFisheyeDegree8Release1") return "DE4RadialFisheyeDegree8";
    return id;
}

} // namespace ldpk
} // namespace Orvane
