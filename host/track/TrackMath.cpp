#include "host/track/TrackMath.h"

#include <algorithm>
#include <cmath>

namespace Orvane {

namespace {

/// Windows whose variance per sample is below this count as flat (no structure to correlate).
constexpr double kFlatVariance = 1e-12;

/// Catmull-Rom weights of the four taps around a fraction t (taps at -1, 0, 1, 2) and their derivatives.
void CubicWeights(double t, double w[4], double d[4]) {
    const double t2 = t * t, t3 = t2 * t;
    w[0] = 0.5 * (-t3 + 2.0 * t2 - t);
    w[1] = 0.5 * (3.0 * t3 - 5.0 * t2 + 2.0);
    w[2] = 0.5 * (-3.0 * t3 + 4.0 * t2 + t);
    w[3] = 0.5 * (t3 - t2);
    d[0] = 0.5 * (-3.0 * t2 + 4.0 * t - 1.0);
    d[1] = 0.5 * (9.0 * t2 - 10.0 * t);
    d[2] = 0.5 * (-9.0 * t2 + 8.0 * t + 1.0);
    d[3] = 0.5 * (3.0 * t2 - 2.0 * t);
}

/// Value and gradient of the plane at (x, y); taps beyond the edges repeat the edge samples.
void Sample(const Plane &p, double x, double y, double &v, double &gx, double &gy) {
    const double fx = std::floor(x), fy = std::floor(y);
    double wx[4], dx[4], wy[4], dy[4];
    CubicWeights(x - fx, wx, dx);
    CubicWeights(y - fy, wy, dy);
    const int ix = static_cast<int>(fx) - 1, iy = static_cast<int>(fy) - 1;
    v = gx = gy = 0.0;
    for (int j = 0; j < 4; ++j) {
        const float *row = p.Row(std::clamp(iy + j, 0, p.h - 1));
        double rv = 0.0, rd = 0.0;
        for (int i = 0; i < 4; ++i) {
            const double s = row[std::clamp(ix + i, 0, p.w - 1)];
            rv += wx[i] * s;
            rd += dx[i] * s;
        }
        v += wy[j] * rv;
        gx += wy[j] * rd;
        gy += dy[j] * rv;
    }
}

double Correlation(double cross, double norm, double s, double s2, int n) {
    const double var = s2 - s * s / n;
    if (!(var > kFlatVariance * n) || !(norm > 0.0)) return 0.0;
    return std::clamp(cross / (norm * std::sqrt(var)), -1.0, 1.0);
}

/// Solves the first n x n of a x = b in place (partial pivoting); false when singular.
bool Solve(double a[8][8], double b[8], int n) {
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

bool Plausible(const Placement &p) {
    return std::isfinite(p.tx) && std::isfinite(p.ty) && std::abs(p.tx) <= 1.5 && std::abs(p.ty) <= 1.5 &&
           p.m00 > 0.7 && p.m00 < 1.4 && p.m11 > 0.7 && p.m11 < 1.4 && std::abs(p.m01) < 0.5 && std::abs(p.m10) < 0.5;
}
} // namespace

double SampledNcc(const Plane &plane, const Pattern &pat, int qx, int qy, const Placement &at) {
    double cross = 0.0, s = 0.0, s2 = 0.0;
    ForPlaced(pat, qx, qy, at, [&](size_t k, double, double, double x, double y) {
        double v, gx, gy;
        Sample(plane, x, y, v, gx, gy);
        cross += pat.zero[k] * v;
        s += v;
        s2 += v * v;
    });
    return Correlation(cross, pat.norm, s, s2, pat.w * pat.h);
}

Placement Refine(const Plane &plane, const Pattern &pat, int qx, int qy, const Placement &start, int iterations) {
    const int n = pat.w * pat.h;
    Placement at = start;
    // Gain and bias from the least-squares fit of the window at the start to the pattern.
    double sv = 0.0, svp = 0.0, sp = 0.0, spp = 0.0;
    ForPlaced(pat, qx, qy, at, [&](size_t k, double, double, double x, double y) {
        double v, gx, gy;
        Sample(plane, x, y, v, gx, gy);
        const double p = pat.v[k];
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
    // Unknowns: translation, the linear part (affine patterns only), gain and bias.
    const bool affine = pat.w >= 9 && pat.h >= 9;
    const int count = affine ? 8 : 4;
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
        double a[8][8] = {}, b[8] = {};
        const double det = at.m00 * at.m11 - at.m01 * at.m10;
        const double i00 = at.m11 / det, i01 = -at.m10 / det, i10 = -at.m01 / det, i11 = at.m00 / det; // M^-T
        ForPlaced(pat, qx, qy, at, [&](size_t k, double u, double v, double x, double y) {
            double val, sgx, sgy;
            Sample(plane, x, y, val, sgx, sgy);
            const double p = pat.v[k];
            const double r = val - gain * p - bias;
            const double gx = gain * (i00 * pgx[k] + i01 * pgy[k]), gy = gain * (i10 * pgx[k] + i11 * pgy[k]);
            double jac[8] = {gx, gy, -p, -1.0, gx * u, gx * v, gy * u, gy * v};
            for (int c = 0; c < count; ++c) {
                b[c] -= jac[c] * r;
                for (int d = c; d < count; ++d) a[c][d] += jac[c] * jac[d];
            }
        });
        for (int c = 1; c < count; ++c)
            for (int d = 0; d < c; ++d) a[c][d] = a[d][c];
        if (!Solve(a, b, count)) break;
        at.tx += b[0];
        at.ty += b[1];
        gain += b[2];
        bias += b[3];
        if (affine) {
            at.m00 += b[4];
            at.m01 += b[5];
            at.m10 += b[6];
            at.m11 += b[7];
        }
        if (!Plausible(at)) return failed;
        if (std::abs(b[0]) < 1e-3 && std::abs(b[1]) < 1e-3) break;
    }
    at.ncc = SampledNcc(plane, pat, qx, qy, at);
    return at;
}

} // namespace Orvane
