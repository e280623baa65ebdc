#pragma once
// Matrix3: a 3x3 matrix acting on column vectors (x, y, 1), the geometry of
// the transform chain (TransformMatrix) and of the transform sampler.
// Affine or projective (a last row other than (0, 0, 1): Apply divides by
// w). Composition reads right to left: (A * B) maps by B, then by A.
//
// Thread safety: a plain value.
#include <array>

#include "host/core/Export.h"

namespace Orvane {

struct ORVANE_API Matrix3 {
    std::array<double, 9> m{1, 0, 0, 0, 1, 0, 0, 0, 1}; ///< row major

    static Matrix3 Identity() { return {}; }
    static Matrix3 Translate(double tx, double ty);
    static Matrix3 Scale(double sx, double sy);
    /// Anticlockwise by `degrees` (x right, y up). Multiples of 90 degrees
    /// give exact zeros and ones.
    static Matrix3 Rotate(double degrees);
    double operator()(int r, int c) const { return m[r * 3 + c]; }
    double &operator()(int r, int c) { return m[r * 3 + c]; }
    Matrix3 operator*(const Matrix3 &o) const;
    double Determinant() const;
    /// The inverse; false (and the identity) when singular.
    bool Invert(Matrix3 &out) const;
    bool IsIdentity(double tolerance = 1e-12) const;
    /// True when the last row is (0, 0, 1).
    bool IsAffine() const { return m[6] == 0.0 && m[7] == 0.0 && m[8] == 1.0; }
    /// Maps (x, y); for a projective matrix divides by w.
    void Apply(double x, double y, double &ox, double &oy) const;
    bool operator==(const Matrix3 &) const = default;
};

} // namespace Orvane
