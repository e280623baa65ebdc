#pragma once
// The small vocabulary of the lens-model kit: a 2-vector, a 2x2 matrix, the
// kit's exceptions and the description of one model parameter.
//
// Coordinates: every model works in two systems. Normalised coordinates run
// from 0 to 1 across the filmback; unit coordinates are centred on the lens
// centre and scaled by half the filmback diagonal (see ldp_builtin).
//
// Thread safety: plain values; the exceptions are immutable once thrown.
#include <cmath>
#include <exception>
#include <string>

namespace Orvane::ldpk {

struct vec2d {
    double x = 0.0, y = 0.0;
    friend vec2d operator+(vec2d a, vec2d b) { return {a.x + b.x, a.y + b.y}; }
    friend vec2d operator-(vec2d a, vec2d b) { return {a.x - b.x, a.y - b.y}; }
    friend vec2d operator*(double s, vec2d a) { return {s * a.x, s * a.y}; }
    double norm2() const { return x * x + y * y; }
    double norm() const { return std::sqrt(norm2()); }
};

/// Row-major 2x2 matrix [m00 m01; m10 m11].
struct mat2d {
    double m00 = 1.0, m01 = 0.0, m10 = 0.0, m11 = 1.0;
    static mat2d zero() { return {0.0, 0.0, 0.0, 0.0}; }
    double det() const { return m00 * m11 - m01 * m10; }
    /// The inverse; a singular matrix gives the zero matrix, so that a degenerate
    /// setting produces finite (if meaningless) numbers rather than infinities.
    mat2d inverse() const {
        const double d = det();
        if (d == 0.0) return zero();
        return {m11 / d, -m01 / d, -m10 / d, m00 / d};
    }
    friend vec2d operator*(const mat2d &m, vec2d p) { return {m.m00 * p.x + m.m01 * p.y, m.m10 * p.x + m.m11 * p.y}; }
    friend mat2d operator*(const mat2d &a, const mat2d &b) {
        return {a.m00 * b.m00 + a.m01 * b.m10, a.m00 * b.m01 + a.m01 * b.m11, a.m10 * b.m00 + a.m11 * b.m10,
                a.m10 * b.m01 + a.m11 * b.m11};
    }
};

/// Base of every exception the kit throws.
class error_base : public std::exception {
public:
    explicit error_base(std::string text) : text_(std::move(text)) {}
    const char *what() const noexcept override { return text_.c_str(); }

private:
    std::string text_;
};

class error_index_out_of_range : public error_base {
public:
    error_index_out_of_range(int index, int first, int last)
        : error_base("ldpk::error: index " + std::to_string(index) + " out of range, range [" + std::to_string(first) +
                     ".." + std::to_string(last) + "]") {}
};

class error_undefined_parameter : public error_base {
public:
    error_undefined_parameter() : error_base("ldpk::error: undefined parameter") {}
};

class error_could_not_read_value : public error_base {
public:
    explicit error_could_not_read_value(const std::string &parameter)
        : error_base("ldpk::error: could not read value for parameter '" + parameter + "'") {}
};

enum class parameter_type { boolean, integer, text, file, real };

/// One parameter of a model as the tool shows it.
struct parameter_descriptor {
    const char *name;
    parameter_type type;
    double default_value;
    double range_min, range_max;
};

} // namespace Orvane::ldpk
