#include "host/image/ResizeFilters.h"

#include <algorithm>
#include <cmath>
#include <numbers>

namespace Orvane {
namespace {

constexpr double kPi = std::numbers::pi;
constexpr double kKaiserBeta = 6.5;

double Sinc(double x) {
    if (x == 0.0) return 1.0;
    const double px = kPi * x;
    return std::sin(px) / px;
}

/// 2 J1(pi x) / (pi x), 1 at 0.
double Jinc(double x) {
    if (x == 0.0) return 1.0;
    const double px = kPi * x;
    return 2.0 * std::cyl_bessel_j(1.0, px) / px;
}

/// Mitchell-Netravali cubic with parameters B and C.
double BCCubic(double x, double b, double c) {
    x = std::fabs(x);
    if (x < 1.0)
        return ((12.0 - 9.0 * b - 6.0 * c) * x * x * x + (-18.0 + 12.0 * b + 6.0 * c) * x * x + (6.0 - 2.0 * b)) / 6.0;
    if (x < 2.0)
        return ((-b - 6.0 * c) * x * x * x + (6.0 * b + 30.0 * c) * x * x + (-12.0 * b - 48.0 * c) * x +
                (8.0 * b + 24.0 * c)) /
               6.0;
    return 0.0;
}

double Window(int window, double t) {
    switch (window) {
    case RszWindowHamming: return 0.54 + 0.46 * std::cos(kPi * t);
    case RszWindowBlackman: return 0.42 + 0.5 * std::cos(kPi * t) + 0.08 * std::cos(2.0 * kPi * t);
    case RszWindowKaiser:
        return std::cyl_bessel_i(0.0, kKaiserBeta * std::sqrt(std::max(0.0, 1.0 - t * t))) /
               std::cyl_bessel_i(0.0, kKaiserBeta);
    default: return 0.5 + 0.5 * std::cos(kPi * t);
    }
}

} // namespace

int ValidResizeFilter(int type) { return type >= RszFirst && type <= RszLast ? type : RszLinear; }

int ValidResizeWindow(int window) {
    return window >= RszWindowHanning && window <= RszWindowKaiser ? window : RszWindowHanning;
}

double ResizeFilterSupport(int type) {
    switch (ValidResizeFilter(type)) {
    case RszNearest:
    case RszBox: return 0.5;
    case RszLinear: return 1.0;
    case RszQuadratic:
    case RszGaussian: return 1.5;
    case RszCubic:
    case RszCatmullRom:
    case RszMitchell: return 2.0;
    case RszLanczos: return 3.0;
    default: return 4.0; // sinc, Bessel
    }
}

double ResizeFilterValue(int type, int window, double x) {
    type = ValidResizeFilter(type);
    const double ax = std::fabs(x);
    const double support = ResizeFilterSupport(type);
    if (ax >= support && !(type <= RszBox && ax == support)) return 0.0;
    switch (type) {
    case RszNearest:
    case RszBox: return 1.0;
    case RszLinear: return 1.0 - ax;
    case RszQuadratic: return ax < 0.5 ? 0.75 - ax * ax : 0.5 * (ax - 1.5) * (ax - 1.5);
    case RszCubic: return BCCubic(ax, 1.0, 0.0);
    case RszCatmullRom: return BCCubic(ax, 0.0, 0.5);
    case RszGaussian: return std::exp(-2.0 * ax * ax);
    case RszMitchell: return BCCubic(ax, 1.0 / 3.0, 1.0 / 3.0);
    case RszLanczos: return Sinc(ax) * Sinc(ax / 3.0);
    case RszSinc: return Sinc(ax) * Window(ValidResizeWindow(window), ax / support);
    default: return Jinc(ax) * Window(ValidResizeWindow(window), ax / support);
    }
}

int MapEdge(int i, int lo, int hi, int edges) {
    if (i >= lo && i < hi) return i;
    const int n = hi - lo;
    if (n <= 0) return lo - 1;
    switch (edges) {
    case EdgeWrap: {
        int k = (i - lo) % n;
        if (k < 0) k += n;
        return lo + k;
    }
    case EdgeDuplicate: return i < lo ? lo : hi - 1;
    case EdgeMirror: {
        const int period = 2 * n;
        int k = (i - lo) % period;
        if (k < 0) k += period;
        return lo + (k < n ? k : period - 1 - k);
    }
    default: return lo - 1;
    }
}

} // namespace Orvane
