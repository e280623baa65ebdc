#include "host/image/BlurFilters.h"

#include <algorithm>
#include <cmath>
#include <complex>

namespace Orvane {
namespace blurfilters {

/// Passes of the fast Gaussian's box cascade, and the sigma above which it
/// runs them: below, the sampled Gaussian has at most 25 taps and costs no
/// more than the boxes, and it is exact where boxes are poorest.
constexpr int kFastGaussianPasses = 5;
constexpr double kFastGaussianMinSigma = 3.0;
/// The sampled Gaussian reaches this many sigmas (its tails beyond hold
/// 6e-5 of the weight, below a 16-bit step).
constexpr double kGaussianSigmas = 4.0;
/// Below this sigma the recursive kinds give way to the sampled Gaussian:
/// their poles are designed for wider kernels.
constexpr double kRecursiveMinSigma = 1.0;
constexpr int kDefaultPasses = 4, kMaxPasses = 64;

/// Normalises double weights to a sum of 1 and stores them as floats.
std::vector<float> Normalised(const std::vector<double> &w) {
    double sum = 0.0;
    for (double v : w) sum += v;
    std::vector<float> out(w.size());
    for (size_t i = 0; i < w.size(); ++i) out[i] = static_cast<float>(w[i] / sum);
    return out;
}

BlurAxis Identity() { return BlurAxis{}; }

BlurAxis FromWeights(const std::vector<double> &w) {
    BlurAxis axis;
    if (w.size() <= 1) return axis;
    axis.kind = BlurAxis::Kind::Taps;
    axis.radius = static_cast<int>(w.size() / 2);
    axis.weights = Normalised(w);
    return axis;
}

/// Symmetric weights f(k) for |k| < limit (f(0) > 0).
template <class F> std::vector<double> Symmetric(double limit, F f) {
    const int r = std::max(0, static_cast<int>(std::ceil(limit)) - 1);
    std::vector<double> w(2 * r + 1);
    for (int k = -r; k <= r; ++k) w[k + r] = f(std::fabs(static_cast<double>(k)));
    return w;
}

std::vector<double> GaussianWeights(double sigma) {
    if (!(sigma > 0.0)) return {1.0};
    const int r = static_cast<int>(std::ceil(kGaussianSigmas * sigma));
    std::vector<double> w(2 * r + 1);
    for (int k = -r; k <= r; ++k) w[k + r] = std::exp(-0.5 * k * k / (sigma * sigma));
    return w;
}

std::vector<double> Convolve(const std::vector<double> &a, const std::vector<double> &b) {
    std::vector<double> c(a.size() + b.size() - 1, 0.0);
    for (size_t i = 0; i < a.size(); ++i)
        for (size_t j = 0; j < b.size(); ++j) c[i + j] += a[i] * b[j];
    return c;
}

/// The variance of the sampled tent 1 - |k| / h.
double TentVariance(double h) {
    double num = 0.0, den = 1.0;
    for (int k = 1; k < h; ++k) {
        const double w = 1.0 - k / h;
        num += 2.0 * k * k * w;
        den += 2.0 * w;
    }
    return num / den;
}

/// The half-width of the sampled tent of variance v (1 for v = 0).
double TentForVariance(double v) {
    if (!(v > 0.0)) return 1.0;
    double lo = 1.0, hi = std::sqrt(6.0 * v) + 3.0;
    for (int i = 0; i < 100; ++i) {
        const double mid = 0.5 * (lo + hi);
        (TentVariance(mid) < v ? lo : hi) = mid;
    }
    return 0.5 * (lo + hi);
}

/// The extended box of variance v (Gwosdek et al.): the largest plain box of
/// variance r (r + 1) / 3 <= v, and end weights alpha making up the rest.
BlurAxis::Box BoxForVariance(double v) {
    BlurAxis::Box box;
    if (!(v > 0.0)) return box;
    box.r = static_cast<int>(std::floor((std::sqrt(12.0 * v + 1.0) - 1.0) / 2.0));
    const double r = box.r;
    box.alpha = (2.0 * r + 1.0) * (v - r * (r + 1.0) / 3.0) / (2.0 * ((r + 1.0) * (r + 1.0) - v));
    if (box.alpha >= 1.0 - 1e-12) { // exactly the next plain box
        ++box.r;
        box.alpha = 0.0;
    }
    box.alpha = std::max(box.alpha, 0.0);
    return box;
}

BlurAxis FromBoxes(const std::vector<BlurAxis::Box> &boxes) {
    BlurAxis axis;
    for (const BlurAxis::Box &b : boxes)
        if (b.r > 0 || b.alpha > 0.0) axis.boxes.push_back(b);
    if (!axis.boxes.empty()) axis.kind = BlurAxis::Kind::Boxes;
    return axis;
}

std::vector<double> BoxWeights(const BlurAxis::Box &b) {
    std::vector<double> w(2 * b.Reach() + 1, 1.0);
    if (b.alpha > 0.0) w.front() = w.back() = b.alpha;
    return w;
}

// ---- recursive Gaussians ----

using Complex = std::complex<double>;

/// Pole sets designed at sigma 2 (the variance of each set's filter there is
/// 4); one of each conjugate pair is listed. Three and five poles are van
/// Vliet, Young and Verbeek's; six were fitted here the same way (least
/// maximum error against the sampled Gaussian, over sigma 2, 4 and 12).
struct PoleSet {
    int pairs;
    Complex pole[3];
    double real; ///< the real pole (0: none)
};
constexpr PoleSet kVYV3 = {1, {{1.41650, 1.00829}}, 1.86543};
constexpr PoleSet kVYV5 = {2, {{0.86430, 1.45389}, {1.61433, 0.83134}}, 1.87504};
constexpr PoleSet kVYV6 = {3, {{0.67638, 1.45158}, {1.39186, 1.01429}, {1.75969, 0.35665}}, 0.0};

/// Forward-backward variance of the filter with poles d^(1/q).
double PoleVariance(const PoleSet &set, double q) {
    auto term = [q](Complex d) {
        const Complex p = std::pow(d, 1.0 / q);
        return 2.0 * p / ((p - 1.0) * (p - 1.0));
    };
    double v = 0.0;
    for (int i = 0; i < set.pairs; ++i) v += 2.0 * term(set.pole[i]).real();
    if (set.real > 0.0) v += term(Complex(set.real, 0.0)).real();
    return v;
}

/// Feedback coefficients: the expanded product of (1 - z^-1 / d^(1/q)).
void PoleFeedback(const PoleSet &set, double sigma, BlurAxis &axis) {
    // The variance grows with q (the poles move towards 1): bisect on log q.
    double lo = std::log(1e-3), hi = std::log(1e7);
    for (int i = 0; i < 200; ++i) {
        const double mid = 0.5 * (lo + hi);
        (PoleVariance(set, std::exp(mid)) < sigma * sigma ? lo : hi) = mid;
    }
    const double q = std::exp(0.5 * (lo + hi));
    std::vector<Complex> poles;
    for (int i = 0; i < set.pairs; ++i) {
        poles.push_back(set.pole[i]);
        poles.push_back(std::conj(set.pole[i]));
    }
    if (set.real > 0.0) poles.push_back(Complex(set.real, 0.0));
    std::vector<Complex> poly(poles.size() + 1, Complex(0.0, 0.0));
    poly[0] = 1.0;
    for (const Complex &d : poles) {
        const Complex r = 1.0 / std::pow(d, 1.0 / q);
        for (size_t j = poly.size() - 1; j >= 1; --j) poly[j] -= r * poly[j - 1];
    }
    axis.order = static_cast<int>(poles.size());
    for (int j = 0; j < axis.order; ++j) axis.a[j] = poly[j + 1].real();
}

/// Young and van Vliet's third-order coefficients from their fit of q.
void YvVFeedback(double sigma, BlurAxis &axis) {
    const double q = sigma >= 2.5 ? 0.98711 * sigma - 0.96330 : 3.97156 - 4.14554 * std::sqrt(1.0 - 0.26891 * sigma);
    const double q2 = q * q, q3 = q2 * q;
    const double b0 = 1.57825 + 2.44413 * q + 1.4281 * q2 + 0.422205 * q3;
    const double b1 = 2.44413 * q + 2.85619 * q2 + 1.26661 * q3;
    const double b2 = -(1.4281 * q2 + 1.26661 * q3);
    const double b3 = 0.422205 * q3;
    axis.order = 3;
    axis.a[0] = -b1 / b0;
    axis.a[1] = -b2 / b0;
    axis.a[2] = -b3 / b0;
}

/// The gain and the boundary matrix of a recursive axis whose feedback is set.
/// Column i is the backward pass's start when the forward pass ends with a
/// unit deviation at w[N - 1 - i]: the forward recursion runs on (no input
/// deviation) until it has died out, then the backward one runs back over it.
void FinishRecursive(BlurAxis &axis) {
    const int K = axis.order;
    axis.kind = BlurAxis::Kind::Recursive;
    axis.gain = 1.0;
    for (int j = 0; j < K; ++j) axis.gain += axis.a[j];
    axis.boundary.assign(static_cast<size_t>(K) * K, 0.0);
    for (int i = 0; i < K; ++i) {
        std::vector<double> w(K, 0.0); // w[K - 1 - i'] = deviation at N - 1 - i'
        w[K - 1 - i] = 1.0;
        // Forward until the deviation is negligible (and at least K samples further).
        for (size_t n = K; n < 4000000; ++n) {
            double s = 0.0;
            for (int j = 1; j <= K; ++j) s -= axis.a[j - 1] * w[n - j];
            w.push_back(s);
            if (n >= static_cast<size_t>(2 * K)) {
                double tail = 0.0;
                for (int j = 0; j < K; ++j) tail = std::max(tail, std::fabs(w[n - j]));
                if (tail < 1e-20) break;
            }
        }
        const size_t n = w.size();
        std::vector<double> y(n + K, 0.0);
        for (size_t m = n; m-- > static_cast<size_t>(K);) {
            double s = axis.gain * w[m];
            for (int j = 1; j <= K; ++j) s -= axis.a[j - 1] * y[m + j];
            y[m] = s;
        }
        for (int m = 0; m < K; ++m) axis.boundary[static_cast<size_t>(m) * K + i] = y[K + m];
    }
}

} // namespace blurfilters

int ValidBlurType(int type) {
    switch (type) {
    case BlurBox:
    case BlurSoften:
    case BlurBartlett:
    case BlurSharpen:
    case BlurGaussian:
    case BlurFastGaussian:
    case BlurMultiBox:
    case BlurYvVGaussian:
    case BlurVYV3Gaussian:
    case BlurVYV5Gaussian:
    case BlurVYV6Gaussian: return type;
    default: return BlurSoften;
    }
}

bool IsRecursiveBlur(int type) { return type >= BlurYvVGaussian && type <= BlurVYV6Gaussian; }

int BlurPassCount(int type, int passes) {
    type = ValidBlurType(type);
    if (type != BlurSharpen && type != BlurMultiBox) return 1;
    return passes < 1 ? blurfilters::kDefaultPasses : std::min(passes, blurfilters::kMaxPasses);
}

void BlurPixels(double x, double y, int frameWidth, double xScale, double yScale, double &px, double &py) {
    const double width = frameWidth >= 1 ? frameWidth : 720.0;
    const double aspect = xScale > 0.0 && yScale > 0.0 && std::isfinite(xScale / yScale) ? xScale / yScale : 1.0;
    px = x > 0.0 && std::isfinite(x) ? x * width : 0.0;
    py = y > 0.0 && std::isfinite(y) ? y * width * aspect : 0.0;
}

int BlurAxis::Reach() const {
    switch (kind) {
    case Kind::Taps: return radius;
    case Kind::Boxes: {
        int reach = 0;
        for (const Box &b : boxes) reach += b.Reach();
        return reach;
    }
    case Kind::Recursive: return -1;
    default: return 0;
    }
}

std::vector<float> BlurAxis::AsTaps() const {
    switch (kind) {
    case Kind::Taps: return weights;
    case Kind::Boxes: {
        std::vector<double> w{1.0};
        for (const Box &b : boxes) w = blurfilters::Convolve(w, blurfilters::BoxWeights(b));
        return blurfilters::Normalised(w);
    }
    case Kind::Recursive: return {};
    default: return {1.f};
    }
}

BlurAxis MakeBlurAxis(int type, double pixels, int passes) {
    using namespace blurfilters;
    type = ValidBlurType(type);
    passes = BlurPassCount(type, passes);
    const double p = pixels > 0.0 && std::isfinite(pixels) ? pixels : 0.0;
    if (p <= 0.0) return Identity();
    const double sigma = BlurSigma(p);
    switch (type) {
    case BlurBox: {
        BlurAxis::Box box;
        box.r = static_cast<int>(std::floor(p));
        box.alpha = p - box.r;
        return FromBoxes({box});
    }
    case BlurBartlett: return FromWeights(Symmetric(p + 1.0, [p](double k) { return 1.0 - k / (p + 1.0); }));
    case BlurSharpen: {
        const double h = TentForVariance(sigma * sigma / passes);
        const std::vector<double> tent = Symmetric(h, [h](double k) { return 1.0 - k / h; });
        std::vector<double> w{1.0};
        for (int i = 0; i < passes; ++i) w = Convolve(w, tent);
        return FromWeights(w);
    }
    case BlurGaussian: return FromWeights(GaussianWeights(sigma));
    case BlurFastGaussian:
        if (sigma <= kFastGaussianMinSigma) return FromWeights(GaussianWeights(sigma));
        return FromBoxes(
            std::vector<BlurAxis::Box>(kFastGaussianPasses, BoxForVariance(sigma * sigma / kFastGaussianPasses)));
    case BlurMultiBox: return FromBoxes(std::vector<BlurAxis::Box>(passes, BoxForVariance(sigma * sigma / passes)));
    case BlurYvVGaussian:
    case BlurVYV3Gaussian:
    case BlurVYV5Gaussian:
    case BlurVYV6Gaussian: {
        if (sigma < kRecursiveMinSigma) return FromWeights(GaussianWeights(sigma));
        BlurAxis axis;
        if (type == BlurYvVGaussian)
            YvVFeedback(sigma, axis);
        else
            PoleFeedback(type == BlurVYV3Gaussian ? kVYV3 : type == BlurVYV5Gaussian ? kVYV5 : kVYV6, sigma, axis);
        FinishRecursive(axis);
        return axis;
    }
    default: // BlurSoften
        return FromWeights(Symmetric(
            p + 1.0, [p](double k) { return 0.5 * (1.0 + std::cos(3.14159265358979323846 * k / (p + 1.0))); }));
    }
}

} // namespace Orvane
