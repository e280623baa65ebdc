#pragma once
// The six lens models of the kit, each a chain of a distortion polynomial and
// linear extenders in unit coordinates (undistort runs the chain forward,
// distort backward with Newton's method on the polynomial), the factory that
// makes them in their listing order, and the model IDs derived from names.
//
// Thread safety: as tde4_ld_plugin.
#include <memory>
#include <string>
#include <vector>

#include "operators/warp/ldpk/Builtin.h"

namespace Orvane {

namespace ldpk {
/// A model around one polynomial: its chain is the polynomial alone unless the model overrides it.
template <class Polynomial> class polynomial_model : public ldp_builtin {
public:
    const generic_distortion_base &distortion() const override { return poly_; }
    const Polynomial &polynomial() const { return poly_; }
    // A model that overrides undistort_unit overrides this too, with its own chain.
    void undistort_span(const vec2d *in, vec2d *out, int n) const override {
        direct_span([this](vec2d p) { return poly_.eval(p); }, in, out, n);
    }

protected:
    using ldp_builtin::ldp_builtin;
    vec2d undistort_unit(vec2d p) const override { return poly_.eval(p); }
    bool distort_unit(vec2d q, vec2d start, vec2d &p) const override { return newton_inverse(poly_, q, start, p); }
    bool jacobian_unit(vec2d p, mat2d &j) const override {
        j = poly_.jacobian(p);
        return true;
    }
    Polynomial poly_;
};
} // namespace ldpk

class tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy
    : public ldpk::polynomial_model<ldpk::generic_anamorphic_distortion<4>> {
public:
    tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy();
    bool initializeParameters() override;
    /// The chain's linear parts: undistort is e1 (polynomial (e2^-1 p)).
    const ldpk::linear_extender &e1() const { return e1_; }
    const ldpk::linear_extender &e2() const { return e2_; }

    void undistort_span(const ldpk::vec2d *in, ldpk::vec2d *out, int n) const override {
        direct_span([this](ldpk::vec2d p) { return tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::undistort_unit(p); },
                    in, out, n);
    }

protected:
    void prepare() override;
    ldpk::vec2d undistort_unit(ldpk::vec2d p) const override;
    bool distort_unit(ldpk::vec2d q, ldpk::vec2d start, ldpk::vec2d &p) const override;
    bool jacobian_unit(ldpk::vec2d p, ldpk::mat2d &j) const override;

private:
    ldpk::rotation_extender rotation_;
    ldpk::squeeze_x_extender squeeze_x_, pixel_aspect_;
    ldpk::squeeze_y_extender squeeze_y_;
    ldpk::linear_extender e1_, e2_;
};

class tde4_ldp_anamorphic_deg_6 : public ldpk::polynomial_model<ldpk::generic_anamorphic_distortion<6>> {
public:
    tde4_ldp_anamorphic_deg_6();

protected:
    void prepare() override;
};

class tde4_ldp_classic_3de_mixed : public ldpk::polynomial_model<ldpk::classic_3de_mixed_distortion> {
public:
    tde4_ldp_classic_3de_mixed();

protected:
    void prepare() override;
};

class tde4_ldp_radial_decentered_deg_4_cylindric : public ldpk::polynomial_model<ldpk::radial_decentered_distortion> {
public:
    tde4_ldp_radial_decentered_deg_4_cylindric();
    /// The extender after the polynomial: undistort is cylindric (polynomial (p)).
    const ldpk::cylindric_extender_2 &cylindric() const { return cylindric_; }

    void undistort_span(const ldpk::vec2d *in, ldpk::vec2d *out, int n) const override {
        direct_span([this](ldpk::vec2d p) { return tde4_ldp_radial_decentered_deg_4_cylindric::undistort_unit(p); }, in,
                    out, n);
    }

protected:
    void prepare() override;
    ldpk::vec2d undistort_unit(ldpk::vec2d p) const override;
    bool distort_unit(ldpk::vec2d q, ldpk::vec2d start, ldpk::vec2d &p) const override;
    bool jacobian_unit(ldpk::vec2d p, ldpk::mat2d &j) const override;

private:
    ldpk::cylindric_extender_2 cylindric_;
};

/// Radial degree 8 behind a fisheye-to-perspective mapping. The current release cuts the
/// result's radius at 50 (unit coordinates); release 1 leaves it uncut.
class tde4_ldp_radial_deg_8 : public ldpk::polynomial_model<ldpk::generic_radial_distortion> {
public:
    tde4_ldp_radial_deg_8();
    static constexpr double result_radius_limit = 50.0;

    void undistort_span(const ldpk::vec2d *in, ldpk::vec2d *out, int n) const override {
        direct_span([this](ldpk::vec2d p) { return tde4_ldp_radial_deg_8::undistort_unit(p); }, in, out, n);
    }

protected:
    tde4_ldp_radial_deg_8(const char *name, bool cut_result);
    void prepare() override;
    ldpk::vec2d undistort_unit(ldpk::vec2d p) const override;
    bool distort_unit(ldpk::vec2d q, ldpk::vec2d start, ldpk::vec2d &p) const override;
    bool jacobian_unit(ldpk::vec2d p, ldpk::mat2d &j) const override;

private:
    double f_unit_ = 1.0; // focal length in unit coordinates
    bool cut_result_;
};

class tde4_ldp_radial_deg_8_release_1 : public tde4_ldp_radial_deg_8 {
public:
    tde4_ldp_radial_deg_8_release_1();
};

namespace ldpk {
/// The six models, made in their listing order.
std::vector<std::unique_ptr<ldp_builtin>> make_models();
/// A model's ID: its name without the characters that are not letters or digits and without
/// leading digits; the fisheye degree 8 IDs are exchanged so that files saving the older plain
/// ID find the release 1 model.
std::string model_id(const std::string &name);
} // namespace ldpk

} // namespace Orvane
