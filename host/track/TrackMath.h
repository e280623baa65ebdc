#pragma once
// The numeric pieces of the pattern matcher (TrackPoint.cpp): single-channel
// float planes, their window sums, the pattern with its zero-mean copy, the
// normalised cross-correlation at whole and fractional offsets, and the
// Gauss-Newton refinement of a sub-pixel offset.
//
// Coordinates are sample positions of a plane: (i, j) is sample i of row j,
// rows from the bottom as in images. A pattern placed at offset (qx, qy) lies
// over samples qx..qx+w-1, qy..qy+h-1.
//
// Thread safety: plain values; the const functions may run on several threads at once.
#include <cstddef>
#include <vector>

namespace Orvane {

struct Plane {
    int w = 0, h = 0;
    std::vector<float> v;
    void Resize(int width, int height);
    float *Row(int j) { return v.data() + static_cast<size_t>(j) * w; }
    const float *Row(int j) const { return v.data() + static_cast<size_t>(j) * w; }
};

/// A plane with the sums of its values and squares over any rectangle (summed-area tables, in double).
struct PlaneStats {
    Plane plane;
    std::vector<double> sum, sumSq; ///< (w + 1) x (h + 1)
    /// Recomputes the tables after the plane changed.
    void Update();
    /// Sum and sum of squares of the w x h window at (x, y).
    void Window(int x, int y, int w, int h, double &s, double &s2) const;
};

/// Halves a plane by averaging 2 x 2 blocks (an odd last column or row is dropped).
void Halve(const Plane &in, Plane &out);

struct Pattern {
    int w = 0, h = 0;
    std::vector<float> v;    ///< the values
    std::vector<float> zero; ///< the values less their mean
    double norm = 0.0;       ///< root of the sum of squares of `zero`
    /// Takes the w x h samples at (x, y) of `plane` (w and h already set).
    void SetFrom(const Plane &plane, int x, int y);
    /// This pattern at half size, from `full`.
    void Halve(const Pattern &full);
    /// No variation to correlate with.
    bool Flat() const;
};

/// Zero-mean normalised cross-correlation of `pat` at whole offset (x, y): -1..1, 0 where the window is flat.
double Ncc(const PlaneStats &img, const Pattern &pat, int x, int y);

/// Where the pattern lies over a plane, to a fraction of a pixel: pattern sample (i, j), at (u, v) from the
/// pattern's centre, lies at (qx + cx + tx + m00 u + m01 v, qy + cy + ty + m10 u + m11 v), with (cx, cy) the
/// pattern's centre ((w - 1) / 2, (h - 1) / 2). The linear part follows mild turns and scale changes; the
/// refinement keeps it a turn with a uniform scale.
struct Placement {
    double tx = 0.0, ty = 0.0;
    double m00 = 1.0, m01 = 0.0, m10 = 0.0, m11 = 1.0;
    double ncc = -2.0;     ///< the correlation there
    double residual = 0.0; ///< after a refinement: the sum of squares of the fit's residual
};

/// The correlation of `pat` placed at `at` relative to whole offset (qx, qy), the plane read by Catmull-Rom
/// interpolation.
double SampledNcc(const Plane &plane, const Pattern &pat, int qx, int qy, const Placement &at);

/// Gauss-Newton refinement of a placement relative to whole offset (qx, qy), fitting the interpolated plane to
/// gain * pattern + bias (so brightness and contrast changes do not move it). With `turns` (patterns of at least 9 x 9)
/// it fits a turn and a uniform scale as well; without, it keeps the linear part of `start`. Gives `start` with ncc -2
/// when the pattern would leave the plane (with the taps of the interpolation) or the linear part leaves 0.7..1.4 in
/// scale or 0.5 off-diagonal.
Placement Refine(const Plane &plane, const Pattern &pat, int qx, int qy, const Placement &start, int iterations,
                 bool turns);

} // namespace Orvane
