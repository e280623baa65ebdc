// Parameters, coordinates, the start-value table and the normalised-coordinate operations shared by every model.
#include "operators/warp/ldpk/Builtin.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace Orvane::ldpk {

const char *const ldp_builtin::builtin_names[n_builtin] = {
    "tde4_focal_length_cm",         "tde4_filmback_width_cm",       "tde4_filmback_height_cm",
    "tde4_lens_center_offset_x_cm", "tde4_lens_center_offset_y_cm", "tde4_pixel_aspect",
    "tde4_custom_focus_distance_cm"};

ldp_builtin::ldp_builtin(const char *name, std::span<const parameter_descriptor> params)
    : name_(name), params_(params.first(std::min<size_t>(params.size(), max_parameters))) {
    for (size_t i = 0; i < params_.size(); ++i) values_[i] = params_[i].default_value;
}

int ldp_builtin::parameter_index(const char *identifier) const {
    for (size_t i = 0; i < params_.size(); ++i)
        if (identifier && std::strcmp(identifier, params_[i].name) == 0) return static_cast<int>(i);
    return -1;
}

int ldp_builtin::builtin_index(const char *identifier) const {
    for (int i = 0; i < n_builtin; ++i)
        if (identifier && std::strcmp(identifier, builtin_names[i]) == 0) return i;
    return -1;
}

const parameter_descriptor &ldp_builtin::parameter(int i) const {
    if (i < 0 || i >= getNumParameters()) throw error_index_out_of_range(i, 0, getNumParameters() - 1);
    return params_[i];
}

const char *ldp_builtin::getParameterName(int i) const {
    return i >= 0 && i < getNumParameters() ? params_[i].name : nullptr;
}

bool ldp_builtin::getParameterType(const char *identifier, parameter_type &type) const {
    if (builtin_index(identifier) >= 0) return type = parameter_type::real, true;
    const int i = parameter_index(identifier);
    if (i < 0) return false;
    type = params_[i].type;
    return true;
}

bool ldp_builtin::hasParameterDefault(const char *identifier) const { return parameter_index(identifier) >= 0; }

// Every parameter of the kit's models is a double: the other types have no defaults.
bool ldp_builtin::getParameterDefaultValue(const char *, bool &) const { return false; }
bool ldp_builtin::getParameterDefaultValue(const char *, int &) const { return false; }
bool ldp_builtin::getParameterDefaultValue(const char *, std::string &) const { return false; }

bool ldp_builtin::getParameterDefaultValue(const char *identifier, double &v) const {
    const int i = parameter_index(identifier);
    if (i < 0) return false;
    v = params_[i].default_value;
    return true;
}

bool ldp_builtin::getParameterRange(const char *identifier, double &a, double &b) const {
    const int i = parameter_index(identifier);
    if (i < 0) return false;
    a = params_[i].range_min;
    b = params_[i].range_max;
    return true;
}

bool ldp_builtin::setParameterValue(const char *, bool) { return false; }
bool ldp_builtin::setParameterValue(const char *, int) { return false; }
bool ldp_builtin::setParameterValue(const char *, const char *) { return false; }

bool ldp_builtin::setParameterValue(const char *identifier, double v) {
    double *slot = nullptr;
    if (const int b = builtin_index(identifier); b >= 0)
        slot = &builtin_[b];
    else if (const int i = parameter_index(identifier); i >= 0)
        slot = &values_[i];
    if (!slot) return false;
    if (*slot != v) {
        *slot = v;
        table_ready_.store(false, std::memory_order_release);
    }
    return true;
}

void ldp_builtin::set_parameter_from_text(const char *identifier, const char *text) {
    if (builtin_index(identifier) < 0 && parameter_index(identifier) < 0) throw error_undefined_parameter();
    char *end = nullptr;
    errno = 0;
    const double v = text ? std::strtod(text, &end) : 0.0;
    if (!text || end == text || errno == ERANGE || !std::isfinite(v)) throw error_could_not_read_value(identifier);
    while (*end == ' ' || *end == '\t' || *end == '\r' || *end == '\n') ++end;
    if (*end != '\0') throw error_could_not_read_value(identifier);
    setParameterValue(identifier, v);
}

bool ldp_builtin::initializeParameters() {
    const auto &[fl, w, h, xlco, ylco, pa, fd] = builtin_;
    if (w == 0.0) std::fputs("ldp_builtin: filmback width is 0.\n", stderr);
    if (h == 0.0) std::fputs("ldp_builtin: filmback height is 0.\n", stderr);
    if (fl == 0.0) std::fputs("ldp_builtin: focal length is 0.\n", stderr);
    if (pa == 0.0) std::fputs("ldp_builtin: pixel aspect is 0.\n", stderr);
    r_fb_ = 0.5 * std::sqrt(w * w + h * h);
    // The coordinate maps run for every position: they multiply by these rather than divide.
    inv_r_fb_ = 1.0 / r_fb_;
    inv_w_ = 1.0 / w;
    inv_h_ = 1.0 / h;
    prepare();
    table_ready_.store(false, std::memory_order_release);
    return true;
}

void ldp_builtin::undistort_span(const vec2d *in, vec2d *out, int n) const {
    direct_span([this](vec2d p) { return undistort_unit(p); }, in, out, n);
}

bool ldp_builtin::undistort(double x0, double y0, double &x1, double &y1) {
    const vec2d p = from_unit(undistort_unit(to_unit({x0, y0})));
    x1 = p.x;
    y1 = p.y;
    return std::isfinite(p.x) && std::isfinite(p.y);
}

bool ldp_builtin::distort(double x0, double y0, double x1_start, double y1_start, double &x1, double &y1) {
    vec2d p;
    const bool ok = distort_unit(to_unit({x0, y0}), to_unit({x1_start, y1_start}), p);
    p = from_unit(p);
    x1 = p.x;
    y1 = p.y;
    return ok;
}

bool ldp_builtin::distort(double x0, double y0, double &x1, double &y1) {
    const auto &table = start_table();
    const auto cell = [](double t, int n) {
        return std::clamp(static_cast<int>(std::floor((n - 1) * t + 0.5)), 0, n - 1);
    };
    const vec2d start = table[cell(x0, table_columns) + cell(y0, table_rows) * table_columns];
    return distort(x0, y0, start.x, start.y, x1, y1);
}

const std::array<vec2d, ldp_builtin::table_columns * ldp_builtin::table_rows> &ldp_builtin::start_table() {
    if (!table_ready_.load(std::memory_order_acquire)) {
        std::lock_guard lock(table_lock_);
        if (!table_ready_.load(std::memory_order_acquire)) {
            build_start_table();
            table_ready_.store(true, std::memory_order_release);
        }
    }
    return table_;
}

void ldp_builtin::build_start_table() {
    // The middle cell, then outward: rows from the middle down and then up, and in each row the
    // columns from the middle left and then right. Each cell starts from its neighbour nearer the
    // middle (in Y first, else in X), which the walk has already done.
    constexpr int mid_c = (table_columns - 1) / 2, mid_r = (table_rows - 1) / 2;
    for (int i = 0; i < table_columns * table_rows; ++i) {
        const int c = i % table_columns, r = i / table_columns;
        const int cc = c > mid_c ? c : mid_c - c, rr = r > mid_r ? r : mid_r - r;
        const vec2d at{cc / double(table_columns - 1), rr / double(table_rows - 1)};
        vec2d start = at;
        if (rr != mid_r)
            start = table_[cc + (rr > mid_r ? rr - 1 : rr + 1) * table_columns];
        else if (cc != mid_c)
            start = table_[(cc > mid_c ? cc - 1 : cc + 1) + rr * table_columns];
        double x1, y1;
        distort(at.x, at.y, start.x, start.y, x1, y1);
        table_[cc + rr * table_columns] = {x1, y1};
    }
}

bool ldp_builtin::getJacobianMatrix(double x0, double y0, double &m00, double &m01, double &m10, double &m11) {
    mat2d j;
    const bool ok = jacobian_unit(to_unit({x0, y0}), j);
    // Normalised x scales to unit by w_fb / r_fb, y by h_fb / r_fb: the diagonal keeps, the rest scale by the ratio.
    const double w = builtin_[1], h = builtin_[2];
    m00 = j.m00;
    m01 = j.m01 * h / w;
    m10 = j.m10 * w / h;
    m11 = j.m11;
    return ok;
}

namespace {
// Maps the outline of a box at 32 points per side and keeps the extremes. A sampled outline
// can miss a bulge between samples by a fraction of the sample spacing.
template <class Map> bool outline_box(double xa, double ya, double xb, double yb, double &xa_out, double &ya_out,
                                      double &xb_out, double &yb_out, Map map) {
    constexpr int steps = 32;
    xa_out = ya_out = HUGE_VAL;
    xb_out = yb_out = -HUGE_VAL;
    bool ok = true;
    for (int side = 0; side < 4; ++side)
        for (int k = 0; k < steps; ++k) {
            const double t = k / double(steps);
            const double x = side == 0 ? xa + t * (xb - xa) : side == 1 ? xb : side == 2 ? xb - t * (xb - xa) : xa;
            const double y = side == 0 ? ya : side == 1 ? ya + t * (yb - ya) : side == 2 ? yb : yb - t * (yb - ya);
            double mx, my;
            if (!map(x, y, mx, my)) ok = false;
            xa_out = std::min(xa_out, mx);
            xb_out = std::max(xb_out, mx);
            ya_out = std::min(ya_out, my);
            yb_out = std::max(yb_out, my);
        }
    return ok;
}
} // namespace

bool ldp_builtin::getBoundingBoxUndistorted(double xa, double ya, double xb, double yb, double &xa_out, double &ya_out,
                                            double &xb_out, double &yb_out) {
    return outline_box(xa, ya, xb, yb, xa_out, ya_out, xb_out, yb_out,
                       [this](double x, double y, double &mx, double &my) { return undistort(x, y, mx, my); });
}

bool ldp_builtin::getBoundingBoxDistorted(double xa, double ya, double xb, double yb, double &xa_out, double &ya_out,
                                          double &xb_out, double &yb_out) {
    return outline_box(xa, ya, xb, yb, xa_out, ya_out, xb_out, yb_out,
                       [this](double x, double y, double &mx, double &my) { return distort(x, y, mx, my); });
}

} // namespace Orvane::ldpk
