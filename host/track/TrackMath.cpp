#include "host/track/TrackMath.h"

#include <algorithm>
#include <cmath>

namespace Orvane {

namespace {

/// Windows whose variance per sample is below this count as flat (no structure to correlate).
constexpr double kFlatVariance = 1e-12;
/// The refinement stops once a step moves less than kSettledStep pixels, or less than kSettledFraction of the
/// translation's standard error.
constexpr double kSettledStep = 1e-3, kSettledFraction = 0.05;

/// Catmull-Rom weights of the four taps around a fraction t (taps at -1, 0, 1, 2).
void CubicWeights(double t, double w[4]) {
    const double t2 = t * t, t3 = t2 * t;
    w[0] = 0.5 * (-t3 + 2.0 * t2 - t);
    w[1] = 0.5 * (3.0 * t3 - 5.0 * t2 + 2.0);
    w[2] = 0.5 * (-3.0 * t3 + 4.0 * t2 + t);
    w[3] = 0.5 * (t3 - t2);
}

/// The plane's value at (x, y); taps beyond the edges repeat the edge samples.
double Sample(const Plane &p, double x, double y) {
    const double fx = std::floor(x), fy = std::floor(y);
    double wx[4], wy[4];
    CubicWeights(x - fx, wx);
    CubicWeights(y - fy, wy);
    const int ix = static_cast<int>(fx) - 1, iy = static_cast<int>(fy) - 1;
    double v = 0.0;
    for (int j = 0; j < 4; ++j) {
        const float *row = p.Row(std::clamp(iy + j, 0, p.h - 1));
        double rv = 0.0;
        for (int i = 0; i < 4; ++i) rv += wx[i] * row[std::clamp(ix + i, 0, p.w - 1)];
        v += wy[j] * rv;
    }
    return v;
}

double Correlation(double cross, double norm, double s, double s2, int n) {
    const double var = s2 - s * s / n;
    if (!(var > kFlatVariance * n) || !(norm > 0.0)) return 0.0;
    return std::clamp(cross / (norm * std::sqrt(var)), -1.0, 1.0);
}

/// Solves the first n x n of a x = b in place (partial pivoting); false when singular.
bool Solve(double a[6][6], double b[6], int n) {
    for (int c = 0; c < n; ++c) {
        int pivot = c;
        for (int r = c + 1; r < n; ++r)
            if (std::abs(a[r][c]) > std::abs(a[pivot][c])) pivot = r;
        if (!(std::abs(a[pivot][c]) > 1e-30)) return false;
        std::swap(a[c], a[pivot]);
        std::swap(b[c], b[pivot]);
        for (int r = c + 1; r < n; ++r) {
            const double f = a[r][c] / a[c][c];
            for (int k = c; k < n; ++k) a[r][k] -= f * a[c][k];
            b[r] -= f * b[c];
        }
    }
    for (int c = n - 1; c >= 0; --c) {
        for (int k = c + 1; k < n; ++k) b[c] -= a[c][k] * b[k];
        b[c] /= a[c][c];
    }
    return true;
}

} // namespace

void Plane::Resize(int width, int height) {
    w = width;
    h = height;
    v.resize(static_cast<size_t>(w) * h);
}

void PlaneStats::Update() {
    const int w = plane.w, h = plane.h, stride = w + 1;
    sum.assign(static_cast<size_t>(stride) * (h + 1), 0.0);
    sumSq.assign(sum.size(), 0.0);
    for (int j = 0; j < h; ++j) {
        const float *row = plane.Row(j);
        double rs = 0.0, rs2 = 0.0;
        for (int i = 0; i < w; ++i) {
            rs += row[i];
            rs2 += static_cast<double>(row[i]) * row[i];
            const size_t at = static_cast<size_t>(j + 1) * stride + i + 1;
            sum[at] = sum[at - stride] + rs;
            sumSq[at] = sumSq[at - stride] + rs2;
        }
    }
}

void PlaneStats::Window(int x, int y, int w, int h, double &s, double &s2) const {
    const size_t stride = plane.w + 1;
    const size_t a = y * stride + x, b = a + w, c = (y + h) * stride + x, d = c + w;
    s = sum[d] - sum[b] - sum[c] + sum[a];
    s2 = sumSq[d] - sumSq[b] - sumSq[c] + sumSq[a];
}

void Halve(const Plane &in, Plane &out) {
    out.Resize(in.w / 2, in.h / 2);
    for (int j = 0; j < out.h; ++j) {
        const float *a = in.Row(2 * j), *b = in.Row(2 * j + 1);
        float *o = out.Row(j);
        for (int i = 0; i < out.w; ++i) o[i] = 0.25f * (a[2 * i] + a[2 * i + 1] + b[2 * i] + b[2 * i + 1]);
    }
}

namespace {
void Centre(Pattern &p) {
    double mean = 0.0;
    for (float x : p.v) mean += x;
    mean /= std::max<size_t>(1, p.v.size());
    p.zero.resize(p.v.size());
    double sq = 0.0;
    for (size_t i = 0; i < p.v.size(); ++i) {
        p.zero[i] = static_cast<float>(p.v[i] - mean);
        sq += static_cast<double>(p.zero[i]) * p.zero[i];
    }
    p.norm = std::sqrt(sq);
}
} // namespace

void Pattern::SetFrom(const Plane &plane, int x, int y) {
    v.resize(static_cast<size_t>(w) * h);
    for (int j = 0; j < h; ++j) std::copy_n(plane.Row(y + j) + x, w, v.data() + static_cast<size_t>(j) * w);
    Centre(*this);
}

void Pattern::Halve(const Pattern &full) {
    Plane in{full.w, full.h, full.v}, out;
    Orvane::Halve(in, out);
    w = out.w;
    h = out.h;
    v = std::move(out.v);
    Centre(*this);
}

bool Pattern::Flat() const {
    const double n = static_cast<double>(w) * h;
    return n <= 0.0 || !(norm * norm > kFlatVariance * n);
}

double Ncc(const PlaneStats &img, const Pattern &pat, int x, int y) {
    double cross = 0.0;
    for (int j = 0; j < pat.h; ++j) {
        const float *row = img.plane.Row(y + j) + x;
        const float *z = pat.zero.data() + static_cast<size_t>(j) * pat.w;
        float rowCross = 0.f;
        for (int i = 0; i < pat.w; ++i) rowCross += z[i] * row[i];
        cross += rowCross;
    }
    double s, s2;
    img.Window(x, y, pat.w, pat.h, s, s2);
    return Correlation(cross, pat.norm, s, s2, pat.w * pat.h);
}

namespace {
/// Calls fn(index, u, v, x, y) for every pattern sample: its offset from the pattern centre and where it lies.
template <class Fn> void ForPlaced(const Pattern &pat, int qx, int qy, const Placement &at, Fn &&fn) {
    const double cx = 0.5 * (pat.w - 1), cy = 0.5 * (pat.h - 1);
    const double ox = qx + cx + at.tx, oy = qy + cy + at.ty;
    for (int j = 0; j < pat.h; ++j)
        for (int i = 0; i < pat.w; ++i) {
            const double u = i - cx, v = j - cy;
            fn(static_cast<size_t>(j) * pat.w + i, u, v, ox + at.m00 * u + at.m01 * v, oy + at.m10 * u + at.m11 * v);
        }
}

/// A placement the refinement may stand on: a mild turn and scale, with every pattern sample and its cubic taps
/// inside the plane (so the fit never reads repeated edge samples).
bool Plausible(const Plane &plane, const Pattern &pat, int qx, int qy, const Placement &p) {
    if (!(std::isfinite(p.tx) && std::isfinite(p.ty) && p.m00 > 0.7 && p.m00 < 1.4 && p.m11 > 0.7 && p.m11 < 1.4 &&
          std::abs(p.m01) < 0.5 && std::abs(p.m10) < 0.5))
        return false;
    const double cx = 0.5 * (pat.w - 1), cy = 0.5 * (pat.h - 1);
    const double rx = std::abs(p.m00) * cx + std::abs(p.m01) * cy, ry = std::abs(p.m10) * cx + std::abs(p.m11) * cy;
    const double x = qx + cx + p.tx, y = qy + cy + p.ty;
    return x - rx >= 1.0 && y - ry >= 1.0 && x + rx <= plane.w - 3.0 && y + ry <= plane.h - 3.0;
}
} // namespace

double SampledNcc(const Plane &plane, const Pattern &pat, int qx, int qy, const Placement &at) {
    double cross = 0.0, s = 0.0, s2 = 0.0;
    ForPlaced(pat, qx, qy, at, [&](size_t k, double, double, double x, double y) {
        const double v = Sample(plane, x, y);
        cross += pat.zero[k] * v;
        s += v;
        s2 += v * v;
    });
    return Correlation(cross, pat.norm, s, s2, pat.w * pat.h);
}

Placement Refine(const Plane &plane, const Pattern &pat, int qx, int qy, const Placement &start, int iterations,
                 bool turns) {
    const int n = pat.w * pat.h;
    Placement at = start;
    // Gain and bias from the least-squares fit of the window at the start to the pattern.
    double sv = 0.0, svp = 0.0, sp = 0.0, spp = 0.0;
    ForPlaced(pat, qx, qy, at, [&](size_t k, double, double, double x, double y) {
        const double v = Sample(plane, x, y), p = pat.v[k];
        sv += v;
        svp += v * p;
        sp += p;
        spp += p * p;
    });
    const double varP = spp - sp * sp / n;
    Placement failed = start;
    failed.ncc = -2.0;
    if (!(varP > 0.0)) return failed;
    double gain = (svp - sv * sp / n) / varP, bias = (sv - gain * sp) / n;
    // Unknowns: translation, gain and bias, and with `turns` a turn and a uniform scale. A free 2 x 2 part
    // (shear, scale per axis) was tried: on small patterns of smooth texture its extra freedom trades against the
    // translation and lets the point wander by tenths of a pixel.
    const int count = turns ? 6 : 4;
    // The image's gradient comes from the pattern's (central differences): gain * M^-T * grad P. Unlike the
    // gradient of the interpolated image it shares no noise with the residual, which would pull the answer
    // towards whole and half pixels on noisy frames.
    std::vector<float> pgx(n), pgy(n);
    for (int j = 0; j < pat.h; ++j)
        for (int i = 0; i < pat.w; ++i) {
            const float *row = pat.v.data() + static_cast<size_t>(j) * pat.w;
            const int l = std::max(i - 1, 0), r = std::min(i + 1, pat.w - 1);
            const int d = std::max(j - 1, 0), u = std::min(j + 1, pat.h - 1);
            pgx[static_cast<size_t>(j) * pat.w + i] = (row[r] - row[l]) / float(r - l);
            pgy[static_cast<size_t>(j) * pat.w + i] =
                (pat.v[static_cast<size_t>(u) * pat.w + i] - pat.v[static_cast<size_t>(d) * pat.w + i]) / float(u - d);
        }
    for (int it = 0; it < iterations; ++it) {
        double a[6][6] = {}, b[6] = {}, sumSq = 0.0;
        const double det = at.m00 * at.m11 - at.m01 * at.m10;
        const double i00 = at.m11 / det, i01 = -at.m10 / det, i10 = -at.m01 / det, i11 = at.m00 / det; // M^-T
        ForPlaced(pat, qx, qy, at, [&](size_t k, double u, double v, double x, double y) {
            const double val = Sample(plane, x, y);
            const double p = pat.v[k];
            const double r = val - gain * p - bias;
            sumSq += r * r;
            const double gx = gain * (i00 * pgx[k] + i01 * pgy[k]), gy = gain * (i10 * pgx[k] + i11 * pgy[k]);
            const double jac[6] = {gx, gy, -p, -1.0, gx * u + gy * v, gy * u - gx * v};
            for (int c = 0; c < count; ++c) {
                b[c] -= jac[c] * r;
                for (int d = c; d < count; ++d) a[c][d] += jac[c] * jac[d];
            }
        });
        for (int c = 1; c < count; ++c)
            for (int d = 0; d < c; ++d) a[c][d] = a[d][c];
        // Steps far below the translation's own uncertainty under the residual's noise change nothing that
        // matters: on noisy frames they would go on without settling.
        const double noise = sumSq / std::max(1, n - count);
        const double enough = std::max(kSettledStep, kSettledFraction * std::sqrt(noise / std::min(a[0][0], a[1][1])));
        if (!Solve(a, b, count)) break;
        at.tx += b[0];
        at.ty += b[1];
        gain += b[2];
        bias += b[3];
        if (turns) {
            at.m00 += b[4];
            at.m11 += b[4];
            at.m01 -= b[5];
            at.m10 += b[5];
        }
        if (!Plausible(plane, pat, qx, qy, at)) return failed;
        if (std::abs(b[0]) < enough && std::abs(b[1]) < enough) break;
    }
    double cross = 0.0, wv = 0.0, wv2 = 0.0, residual = 0.0;
    ForPlaced(pat, qx, qy, at, [&](size_t k, double, double, double x, double y) {
        const double val = Sample(plane, x, y);
        cross += pat.zero[k] * val;
        wv += val;
        wv2 += val * val;
        const double r = val - gain * pat.v[k] - bias;
        residual += r * r;
    });
    at.ncc = Correlation(cross, pat.norm, wv, wv2, n);
    at.residual = residual;
    return at;
}

} // namespace Orvane
