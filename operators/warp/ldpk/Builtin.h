#pragma once
// ldpk::ldp_builtin: what every lens model of the kit shares.
//
//  * Seven built-in double parameters, set by the tool from its camera
//    settings and not listed among the model's own: focal length, filmback
//    width and height, lens centre offset x and y (all in cm), pixel aspect
//    and custom focus distance.
//  * The coordinates: normalised (x, y) runs 0 to 1 across the filmback; unit
//    (u, v) = ((x - 0.5) w_fb - x_lco, (y - 0.5) h_fb - y_lco) / r_fb, with
//    r_fb half the filmback diagonal. A model's chain works in unit coordinates.
//  * The model's own parameters (all doubles), stored here and handed to the
//    model's distortion objects by initializeParameters.
//  * The start-value table of distort without a start: 21 x 15 cells over the
//    normalised square, each the inverse of its cell centre, built walking out
//    from the middle so each cell starts from its inner neighbour. It is built
//    on first use after a change, under a lock with the ready flag tested
//    before and after taking it.
//
// Thread safety: as tde4_ld_plugin; the table is the only state filled lazily.
#include <array>
#include <atomic>
#include <mutex>
#include <span>

#include "operators/warp/ldpk/Distortions.h"
#include "operators/warp/ldpk/PluginInterface.h"

namespace Orvane::ldpk {

class ldp_builtin : public tde4_ld_plugin {
public:
    static constexpr int n_builtin = 7;
    static constexpr int max_parameters = 18;
    static constexpr int table_columns = 21, table_rows = 15;

    const char *getModelName() const override { return name_; }
    int getNumParameters() const override { return static_cast<int>(params_.size()); }
    const char *getParameterName(int i) const override;
    bool getParameterType(const char *identifier, parameter_type &type) const override;
    bool hasParameterDefault(const char *identifier) const override;
    bool getParameterDefaultValue(const char *identifier, bool &v) const override;
    bool getParameterDefaultValue(const char *identifier, int &v) const override;
    bool getParameterDefaultValue(const char *identifier, std::string &v) const override;
    bool getParameterDefaultValue(const char *identifier, double &v) const override;
    bool getParameterRange(const char *identifier, double &a, double &b) const override;
    bool setParameterValue(const char *identifier, bool v) override;
    bool setParameterValue(const char *identifier, int v) override;
    bool setParameterValue(const char *identifier, const char *v) override;
    bool setParameterValue(const char *identifier, double v) override;
    bool initializeParameters() override;

    bool undistort(double x0, double y0, double &x1, double &y1) override;
    bool distort(double x0, double y0, double x1_start, double y1_start, double &x1, double &y1) override;
    bool distort(double x0, double y0, double &x1, double &y1) override;
    bool providesJacobianMatrix() const override { return true; }
    bool getJacobianMatrix(double x0, double y0, double &m00, double &m01, double &m10, double &m11) override;
    bool getBoundingBoxUndistorted(double xa, double ya, double xb, double yb, double &xa_out, double &ya_out,
                                   double &xb_out, double &yb_out) override;
    bool getBoundingBoxDistorted(double xa, double ya, double xb, double yb, double &xa_out, double &ya_out,
                                 double &xb_out, double &yb_out) override;

    /// Parameter i of the model's own list; error_index_out_of_range beyond it.
    const parameter_descriptor &parameter(int i) const;
    /// Sets a parameter (built-in or the model's own) from its text form, as a lens file holds it:
    /// error_undefined_parameter for an unknown name, error_could_not_read_value for bad text.
    void set_parameter_from_text(const char *identifier, const char *text);

    /// The direct function (undistort) of n normalised positions at once: out[i] from in[i], non-finite where
    /// it fails. The models bind their chain here at compile time, so a row of positions costs no call each.
    virtual void undistort_span(const vec2d *in, vec2d *out, int n) const;

    vec2d to_unit(vec2d n) const {
        return {((n.x - 0.5) * builtin_[1] - builtin_[3]) * inv_r_fb_,
                ((n.y - 0.5) * builtin_[2] - builtin_[4]) * inv_r_fb_};
    }
    vec2d from_unit(vec2d u) const {
        return {(r_fb_ * u.x + builtin_[1] * 0.5 + builtin_[3]) * inv_w_,
                (r_fb_ * u.y + builtin_[2] * 0.5 + builtin_[4]) * inv_h_};
    }
    double r_fb() const { return r_fb_; }
    /// The built-in values the unit coordinates depend on (cm).
    double filmback_width() const { return builtin_[1]; }
    double filmback_height() const { return builtin_[2]; }
    double lens_centre_offset_x() const { return builtin_[3]; }
    double lens_centre_offset_y() const { return builtin_[4]; }
    /// The distortion object that the inverse iterates on (its counters are the model's).
    virtual const generic_distortion_base &distortion() const = 0;
    /// The start-value table, built if needed: cell (c, r) at c + r x table_columns.
    const std::array<vec2d, table_columns * table_rows> &start_table();
    static const char *const builtin_names[n_builtin];

protected:
    ldp_builtin(const char *name, std::span<const parameter_descriptor> params);
    /// Hands the parameter values to the distortion objects and derives their coefficients.
    virtual void prepare() = 0;
    virtual vec2d undistort_unit(vec2d p) const = 0;
    /// Inverse of undistort_unit at q from `start`, both in unit coordinates.
    virtual bool distort_unit(vec2d q, vec2d start, vec2d &p) const = 0;
    virtual bool jacobian_unit(vec2d p, mat2d &j) const = 0;

    /// undistort_span's loop around a model's own chain in unit coordinates.
    template <class UnitMap> void direct_span(UnitMap unit_map, const vec2d *in, vec2d *out, int n) const {
        for (int i = 0; i < n; ++i) out[i] = from_unit(unit_map(to_unit(in[i])));
    }

    double value(int i) const { return values_[i]; }
    double focal_length_cm() const { return builtin_[0]; }
    double pixel_aspect() const { return builtin_[5]; }

private:
    int parameter_index(const char *identifier) const;
    int builtin_index(const char *identifier) const;
    void build_start_table();

    const char *name_;
    std::span<const parameter_descriptor> params_;
    std::array<double, max_parameters> values_{};
    // focal length, filmback w and h, lens centre offset x and y, pixel aspect, focus distance.
    std::array<double, n_builtin> builtin_{1.0, 0.8, 0.6, 0.0, 0.0, 1.0, 100.0};
    double r_fb_ = 0.5, inv_r_fb_ = 2.0, inv_w_ = 1.0 / 0.8, inv_h_ = 1.0 / 0.6;
    std::array<vec2d, table_columns * table_rows> table_{};
    std::atomic<bool> table_ready_{false};
    std::mutex table_lock_;
};

} // namespace Orvane::ldpk
