#include "tests/support/KeyPlates.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <numbers>
#include <tuple>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"

namespace Orvane::Test {
namespace {

using Rgb = std::array<double, 3>;
constexpr double kPi = std::numbers::pi;

constexpr Rgb kGreenScreen{0.10, 0.50, 0.14}, kBlueScreen{0.07, 0.15, 0.55};

// Foreground colours (linear, straight), none near either screen's hue.
constexpr Rgb kRed{0.70, 0.08, 0.06}, kDark{0.035, 0.03, 0.03}, kGrey{0.45, 0.45, 0.45}, kSkin{0.72, 0.47, 0.36},
    kBright{0.92, 0.90, 0.86}, kWarmWhite{0.85, 0.82, 0.78}, kOrange{0.75, 0.30, 0.15}, kBrownHair{0.12, 0.07, 0.04},
    kBlondeHair{0.62, 0.50, 0.30};

constexpr int kStrands = 24;
constexpr double kSpillReach = 0.03; // of the shorter side

/// A small seeded generator (splitmix64): the same sequence on every platform.
struct SplitMix {
    uint64_t state;
    uint64_t Next() {
        uint64_t z = (state += 0x9E3779B97F4A7C15ull);
        z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ull;
        z = (z ^ (z >> 27)) * 0x94D049BB133111EBull;
        return z ^ (z >> 31);
    }
    /// Uniform in [lo, hi).
    double Uniform(double lo, double hi) { return lo + (hi - lo) * static_cast<double>(Next() >> 11) * 0x1.0p-53; }
};

/// One shape of the layout in pixel coordinates (x right, y up; pixel (i, j) covers [i, i+1] x [j, j+1]).
struct Shape {
    KeyPlateKind kind;
    Rgb colour;
    double opacity = 1;
    bool isArc = false;
    double cx = 0, cy = 0;
    // Box: half sizes hx, hy, turned by `angle`, corners rounded by `corner` (hx = hy = corner: a disc).
    double hx = 0, hy = 0, angle = 0, corner = 0;
    double softness = 0; ///< Gaussian sigma of a blurred edge
    double smear = 0;    ///< motion blur length along the box's own x axis (square corners)
    // Arc: the circle of `radius` from angle `start` over `sweep` (> 0) radians, `width` wide.
    double radius = 0, start = 0, sweep = 0, width = 0;
    double x0 = 0, y0 = 0, x1 = 0, y1 = 0; ///< no alpha outside
};

/// A sample's coverage by a shape and how far inside the shape's edge it lies (negative outside).
struct Hit {
    double alpha, depth;
};

double BoxDistance(const Shape &s, double lx, double ly) {
    const double qx = std::abs(lx) - (s.hx - s.corner), qy = std::abs(ly) - (s.hy - s.corner);
    return std::hypot(std::max(qx, 0.0), std::max(qy, 0.0)) + std::min(std::max(qx, qy), 0.0) - s.corner;
}

Hit SampleBox(const Shape &s, double x, double y) {
    const double dx = x - s.cx, dy = y - s.cy, c = std::cos(s.angle), n = std::sin(s.angle);
    const double lx = dx * c + dy * n, ly = -dx * n + dy * c;
    const double d = BoxDistance(s, lx, ly);
    double alpha;
    if (s.smear > 0) // the box's extent along x met by the smear segment centred on the sample
        alpha =
            std::abs(ly) < s.hy
                ? std::clamp((std::min(lx + s.smear / 2, s.hx) - std::max(lx - s.smear / 2, -s.hx)) / s.smear, 0.0, 1.0)
                : 0.0;
    else if (s.softness > 0)
        alpha = 0.5 * std::erfc(d / (s.softness * std::numbers::sqrt2));
    else
        alpha = d < 0 ? 1.0 : 0.0;
    return {alpha * s.opacity, -d};
}

Hit SampleArc(const Shape &s, double x, double y) {
    const double dx = x - s.cx, dy = y - s.cy;
    const double along = std::remainder(std::atan2(dy, dx) - s.start - kPi, 2 * kPi) + kPi; // 0 .. 2 pi
    double d;
    if (along <= s.sweep) {
        d = std::abs(std::hypot(dx, dy) - s.radius);
    } else {
        auto toEnd = [&](double a) { return std::hypot(dx - s.radius * std::cos(a), dy - s.radius * std::sin(a)); };
        d = std::min(toEnd(s.start), toEnd(s.start + s.sweep));
    }
    const double inside = s.width / 2 - d;
    return {inside > 0 ? s.opacity : 0.0, inside};
}

void BoundBox(Shape &s) {
    const double c = std::abs(std::cos(s.angle)), n = std::abs(std::sin(s.angle));
    const double margin = 6 * s.softness + s.smear / 2; // the blurred edge is below 1e-9 beyond six sigmas
    const double ex = s.hx * c + s.hy * n + margin, ey = s.hx * n + s.hy * c + margin;
    s.x0 = s.cx - ex, s.x1 = s.cx + ex, s.y0 = s.cy - ey, s.y1 = s.cy + ey;
}

void BoundArc(Shape &s) {
    auto point = [&](double a) {
        return std::array<double, 2>{s.cx + s.radius * std::cos(a), s.cy + s.radius * std::sin(a)};
    };
    std::vector<std::array<double, 2>> points{point(s.start), point(s.start + s.sweep)};
    for (int quarter = -8; quarter <= 8; ++quarter) { // the circle's extremes that the arc passes
        const double a = quarter * kPi / 2;
        if (a > s.start && a < s.start + s.sweep) points.push_back(point(a));
    }
    s.x0 = s.y0 = std::numeric_limits<double>::max();
    s.x1 = s.y1 = std::numeric_limits<double>::lowest();
    for (const auto &[x, y] : points) {
        s.x0 = std::min(s.x0, x - s.width), s.x1 = std::max(s.x1, x + s.width);
        s.y0 = std::min(s.y0, y - s.width), s.y1 = std::max(s.y1, y + s.width);
    }
}

Shape Box(KeyPlateKind kind, const Rgb &colour, double cx, double cy, double hx, double hy) {
    Shape s{.kind = kind, .colour = colour};
    s.cx = cx, s.cy = cy, s.hx = hx, s.hy = hy;
    return s;
}

Shape Disc(KeyPlateKind kind, const Rgb &colour, double cx, double cy, double radius) {
    Shape s = Box(kind, colour, cx, cy, radius, radius);
    s.corner = radius;
    return s;
}

/// Strands leaving the upper half of the head disc, each a circular arc that starts on the head's edge heading
/// roughly outward.
void AddHair(std::vector<Shape> &shapes, const Shape &head, double unit, uint64_t seed) {
    SplitMix rng{seed};
    for (int i = 0; i < kStrands; ++i) {
        Shape s{.kind = KeyPlateKind::Hair, .colour = i % 2 ? kBlondeHair : kBrownHair};
        s.isArc = true;
        s.opacity = rng.Uniform(0.5, 0.9);
        s.width = rng.Uniform(0.4, 2.0);
        s.radius = rng.Uniform(0.25, 0.6) * unit;
        const double root = rng.Uniform(kPi / 6, 5 * kPi / 6), length = rng.Uniform(0.06, 0.18) * unit;
        const double heading = root + rng.Uniform(-0.45, 0.45), bend = rng.Next() & 1 ? 1.0 : -1.0;
        const double px = head.cx + head.hx * std::cos(root), py = head.cy + head.hx * std::sin(root);
        // The centre lies on the side the strand bends to; the strand turns about it from the root.
        s.cx = px - bend * s.radius * std::sin(heading), s.cy = py + bend * s.radius * std::cos(heading);
        const double rootAngle = std::atan2(py - s.cy, px - s.cx), turn = length / s.radius;
        s.start = bend > 0 ? rootAngle : rootAngle - turn;
        s.sweep = turn;
        BoundArc(s);
        shapes.push_back(s);
    }
}

/// The layout, for frames of about 16:9: shapes placed in fractions of the frame, sized by its shorter side.
std::vector<Shape> Layout(KeyPlateKind kind, int width, int height, uint64_t seed) {
    const double w = width, h = height, unit = std::min(w, h), degree = kPi / 180;
    std::vector<Shape> all;
    Shape red = Box(KeyPlateKind::HardEdges, kRed, 0.17 * w, 0.68 * h, 0.10 * unit, 0.16 * unit);
    red.angle = 15 * degree, red.corner = 0.02 * unit;
    all.push_back(red);
    all.push_back(Disc(KeyPlateKind::HardEdges, kDark, 0.17 * w, 0.27 * h, 0.12 * unit));
    Shape soft = Disc(KeyPlateKind::SoftEdges, kGrey, 0.77 * w, 0.70 * h, 0.14 * unit);
    soft.softness = 0.012 * unit;
    all.push_back(soft);
    Shape moving = Box(KeyPlateKind::MotionBlur, kBright, 0.77 * w, 0.27 * h, 0.08 * unit, 0.10 * unit);
    moving.angle = 20 * degree, moving.smear = 0.10 * unit;
    all.push_back(moving);
    for (const auto &[x, colour, opacity] : {std::tuple{0.36, kWarmWhite, 0.4}, std::tuple{0.56, kOrange, 0.7}}) {
        Shape veil = Box(KeyPlateKind::Veils, colour, x * w, 0.88 * h, 0.09 * unit, 0.06 * unit);
        veil.corner = 0.01 * unit, veil.opacity = opacity;
        all.push_back(veil);
    }
    for (Shape &s : all) BoundBox(s);
    Shape head = Disc(KeyPlateKind::Hair, kSkin, 0.45 * w, 0.32 * h, 0.16 * unit);
    BoundBox(head);
    all.push_back(head);
    AddHair(all, head, unit, seed);
    if (kind == KeyPlateKind::Everything) return all;
    std::erase_if(all, [kind](const Shape &s) { return s.kind != kind; });
    return all;
}

/// The screen's light at (u, v) across the frame: a gradient and a vignette, mean 1 over the frame.
double ScreenLight(double u, double v) {
    const double gx = 2 * u - 1, gy = 2 * v - 1, r2 = (gx * gx + gy * gy) / 2;
    return 1 + 0.06 * gx + 0.03 * gy + 0.08 * (1.0 / 3 - r2);
}

/// Three Gaussian values of sigma 1, a function of the seed and the pixel alone.
std::array<double, 3> Grain(uint64_t seed, int x, int y) {
    SplitMix rng{seed ^ (static_cast<uint64_t>(y) << 32 | static_cast<uint32_t>(x)) * 0xD6E8FEB86659FD93ull};
    std::array<double, 4> g;
    for (int i = 0; i < 4; i += 2) { // Box-Muller
        const double radius = std::sqrt(-2 * std::log(1 - rng.Uniform(0, 1))), angle = rng.Uniform(0, 2 * kPi);
        g[i] = radius * std::cos(angle), g[i + 1] = radius * std::sin(angle);
    }
    return {g[0], g[1], g[2]};
}

/// The mean over a pixel's samples of the shapes composited front over back: alpha, and the colour with and without
/// spill (premultiplied).
struct Coverage {
    double alpha = 0;
    Rgb clean{}, spilled{};
};

Coverage CoverPixel(const std::vector<const Shape *> &shapes, int x, int y, const Rgb &screen, double reach) {
    Coverage sum;
    constexpr int n = kKeyPlateSamples;
    for (int j = 0; j < n; ++j)
        for (int i = 0; i < n; ++i) {
            const double sx = x + (i + 0.5) / n, sy = y + (j + 0.5) / n;
            Coverage at;
            for (const Shape *s : shapes) {
                const Hit hit = s->isArc ? SampleArc(*s, sx, sy) : SampleBox(*s, sx, sy);
                if (hit.alpha <= 0) continue;
                const double spill = kSpillAtEdge * std::max(0.0, 1 - std::max(0.0, hit.depth) / reach);
                for (int c = 0; c < 3; ++c) {
                    at.clean[c] = s->colour[c] * hit.alpha + at.clean[c] * (1 - hit.alpha);
                    at.spilled[c] = (s->colour[c] + spill * screen[c]) * hit.alpha + at.spilled[c] * (1 - hit.alpha);
                }
                at.alpha = hit.alpha + at.alpha * (1 - hit.alpha);
            }
            sum.alpha += at.alpha;
            for (int c = 0; c < 3; ++c) sum.clean[c] += at.clean[c], sum.spilled[c] += at.spilled[c];
        }
    sum.alpha /= n * n;
    for (int c = 0; c < 3; ++c) sum.clean[c] /= n * n, sum.spilled[c] /= n * n;
    return sum;
}

Ref<Image> NewPlateImage(int width, int height, int depth) {
    Ref<Image> img = NewImageTagList({{ImgWidth, width}, {ImgHeight, height}, {ImgDepth, depth}});
    img->AllocScanLineData();
    return img;
}

void Put(float *px, const Rgb &rgb, double alpha) {
    for (int c = 0; c < 3; ++c) px[c] = static_cast<float>(rgb[c]);
    px[3] = static_cast<float>(alpha);
}

} // namespace

const char *KeyPlateKindName(KeyPlateKind kind) {
    switch (kind) {
    case KeyPlateKind::HardEdges: return "hard";
    case KeyPlateKind::SoftEdges: return "soft";
    case KeyPlateKind::Hair: return "hair";
    case KeyPlateKind::MotionBlur: return "motion";
    case KeyPlateKind::Veils: return "veils";
    case KeyPlateKind::Everything: break;
    }
    return "everything";
}

KeyPlate MakeKeyPlate(KeyPlateKind kind, ScreenColor screen, int width, int height, uint64_t seed, double grainSigma) {
    width = std::max(width, 16), height = std::max(height, 16);
    const Rgb base = screen == ScreenColor::Green ? kGreenScreen : kBlueScreen;
    KeyPlate plate{.name = std::string(KeyPlateKindName(kind)) + (screen == ScreenColor::Green ? "-green" : "-blue"),
                   .composite = NewPlateImage(width, height, DepthRGBAFlt32),
                   .trueAlpha = NewPlateImage(width, height, DepthAFlt32),
                   .trueForeground = NewPlateImage(width, height, DepthRGBAFlt32),
                   .spilledForeground = NewPlateImage(width, height, DepthRGBAFlt32),
                   .cleanScreen = NewPlateImage(width, height, DepthRGBAFlt32),
                   .screenR = base[0],
                   .screenG = base[1],
                   .screenB = base[2],
                   .grainSigma = grainSigma};
    const std::vector<Shape> shapes = Layout(kind, width, height, seed);
    const double reach = kSpillReach * std::min(width, height);
    ParallelRange(0, height, [&](int first, int last) {
        std::vector<const Shape *> here;
        for (int y = first; y < last; ++y) {
            float *comp = plate.composite->Row<float>(y), *alpha = plate.trueAlpha->Row<float>(y);
            float *clean = plate.trueForeground->Row<float>(y), *spilled = plate.spilledForeground->Row<float>(y);
            float *bg = plate.cleanScreen->Row<float>(y);
            for (int x = 0; x < width; ++x) {
                const double light = ScreenLight((x + 0.5) / width, (y + 0.5) / height);
                const Rgb lit{base[0] * light, base[1] * light, base[2] * light};
                here.clear();
                for (const Shape &s : shapes)
                    if (s.x0 < x + 1 && s.x1 > x && s.y0 < y + 1 && s.y1 > y) here.push_back(&s);
                const Coverage cover = here.empty() ? Coverage{} : CoverPixel(here, x, y, lit, reach);
                const std::array<double, 3> grain = Grain(seed, x, y);
                Rgb seen;
                for (int c = 0; c < 3; ++c)
                    seen[c] = cover.spilled[c] + lit[c] * (1 - cover.alpha) + grainSigma * grain[c];
                Put(comp + 4 * x, seen, 1);
                alpha[x] = static_cast<float>(cover.alpha);
                Put(clean + 4 * x, cover.clean, cover.alpha);
                Put(spilled + 4 * x, cover.spilled, cover.alpha);
                Put(bg + 4 * x, lit, 1);
            }
        }
    });
    return plate;
}

MatteScore ScoreMatte(const Image &alpha, const Image &trueAlpha) {
    constexpr double nan = std::numeric_limits<double>::quiet_NaN();
    if (alpha.Width() != trueAlpha.Width() || alpha.Height() != trueAlpha.Height()) return {nan, nan, nan};
    double sum = 0, worst = 0, edgeSum = 0;
    long long edgeCount = 0;
    for (int y = 0; y < trueAlpha.Height(); ++y)
        for (int x = 0; x < trueAlpha.Width(); ++x) {
            const double truth = trueAlpha.GetFlt(x, y).A, error = std::abs(alpha.GetFlt(x, y).A - truth);
            sum += error, worst = std::max(worst, error);
            if (truth > 0 && truth < 1) edgeSum += error, ++edgeCount;
        }
    const double pixels = static_cast<double>(trueAlpha.Width()) * trueAlpha.Height();
    return {sum / pixels, worst, edgeCount ? edgeSum / static_cast<double>(edgeCount) : 0.0};
}

double EdgeColourDistance(const Image &keyed, const KeyPlate &plate, double minTrueAlpha) {
    const Image &truth = *plate.trueForeground, &lit = *plate.spilledForeground;
    if (keyed.Width() != truth.Width() || keyed.Height() != truth.Height())
        return std::numeric_limits<double>::quiet_NaN();
    double sum = 0;
    long long count = 0;
    for (int y = 0; y < truth.Height(); ++y)
        for (int x = 0; x < truth.Width(); ++x) {
            const FltPixel t = truth.GetFlt(x, y), s = lit.GetFlt(x, y);
            if (t.A <= minTrueAlpha || (s.R == t.R && s.G == t.G && s.B == t.B)) continue; // no spill reaches it
            const FltPixel k = keyed.GetFlt(x, y);
            const double scale = k.A / t.A;
            sum += std::hypot(k.R - scale * t.R, k.G - scale * t.G, k.B - scale * t.B);
            ++count;
        }
    return sum / static_cast<double>(count);
}

} // namespace Orvane::Test
