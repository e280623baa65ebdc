// The pattern matcher against sequences whose motion is known exactly: a
// procedural texture (random-phase sinusoids plus Gaussian blobs, a smooth
// function of the plane) is evaluated at the inverse-moved position of every
// pixel centre, so each frame is the texture moved along the path with no
// resampling error, and the truth of a point is the path applied to it.
#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <limits>
#include <random>
#include <vector>

#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/track/TrackPoint.h"

namespace Orvane {
namespace {

constexpr int kW = 240, kH = 180, kFrames = 30;
constexpr double kPi = 3.14159265358979323846;

/// Waves (wavenumber x, y, phase, amplitude) and Gaussian blobs (x, y, 1 / (2 sigma^2), amplitude).
struct Texture {
    std::vector<std::array<double, 4>> waves, blobs;
    /// By default periods of 9 to 40 pixels: well sampled, and the refinement's cubic interpolation is close to
    /// exact.
    explicit Texture(unsigned seed, double shortestPeriod = 9.0, double longestPeriod = 40.0, int blobCount = 70) {
        std::mt19937 rng(seed);
        std::uniform_real_distribution<double> u(0.0, 1.0);
        for (int i = 0; i < 6; ++i) {
            const double k = 2 * kPi / (shortestPeriod + (longestPeriod - shortestPeriod) * u(rng));
            const double dir = 2.0 * kPi * u(rng);
            waves.push_back({k * std::cos(dir), k * std::sin(dir), 2 * kPi * u(rng), 0.06 + 0.06 * u(rng)});
        }
        for (int i = 0; i < blobCount; ++i) {
            const double sigma = 2.5 + 4.0 * u(rng);
            blobs.push_back({-40 + (kW + 80) * u(rng), -40 + (kH + 80) * u(rng), 0.5 / (sigma * sigma), u(rng) - 0.5});
        }
    }
    double operator()(double x, double y) const {
        double v = 0.5;
        for (const auto &w : waves) v += w[3] * std::sin(w[0] * x + w[1] * y + w[2]);
        for (const auto &b : blobs) {
            const double e = ((x - b[0]) * (x - b[0]) + (y - b[1]) * (y - b[1])) * b[2];
            if (e < 20.0) v += 0.8 * b[3] * std::exp(-e);
        }
        return v;
    }
};

/// Frame k's motion: the texture turned by `angle` and scaled by `scale` about the image centre, then moved by
/// (dx, dy); its pixel values become gain * texture + offset, plus Gaussian noise of deviation `noise`.
struct Motion {
    double dx = 0, dy = 0, angle = 0, scale = 1, gain = 1, offset = 0, noise = 0;
};
using Path = std::vector<Motion>;

/// Where a point of frame 0 (pixel coordinates) lies in frame `m`.
void Truth(const Motion &m, double x, double y, double &tx, double &ty) {
    const double cx = kW / 2.0, cy = kH / 2.0, c = std::cos(m.angle), s = std::sin(m.angle);
    tx = cx + m.scale * (c * (x - cx) - s * (y - cy)) + m.dx;
    ty = cy + m.scale * (s * (x - cx) + c * (y - cy)) + m.dy;
}

Ref<Image> MakeImage(int w, int h, int depth) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    img->AllocScanLineData();
    return img;
}

Ref<Image> Frame(const Texture &tex, const Motion &m, unsigned noiseSeed, int depth = DepthRGBAFlt32) {
    Ref<Image> img = MakeImage(kW, kH, depth);
    std::mt19937 rng(noiseSeed);
    std::normal_distribution<double> noise(0.0, m.noise > 0 ? m.noise : 1.0);
    const double cx = kW / 2.0, cy = kH / 2.0, c = std::cos(m.angle), s = std::sin(m.angle);
    for (int j = 0; j < kH; ++j)
        for (int i = 0; i < kW; ++i) {
            // The inverse of Truth: the frame-0 position seen at this pixel's centre.
            const double px = i + 0.5 - m.dx - cx, py = j + 0.5 - m.dy - cy;
            const double sx = cx + (c * px + s * py) / m.scale, sy = cy + (-s * px + c * py) / m.scale;
            float v = static_cast<float>(m.gain * tex(sx, sy) + m.offset + (m.noise > 0 ? noise(rng) * m.noise : 0));
            img->PutFlt(i, j, {v, v, v, img->IsMask() ? v : 1.f}); // a mask holds its value in alpha
        }
    return img;
}

Path MakePath(double turnPerFrame, double scalePerFrame, double gainPerFrame, double noise) {
    Path path;
    // A drifting, wobbling sub-pixel path: about 1.4 px a frame, never on whole pixels.
    for (int k = 0; k < kFrames; ++k)
        path.push_back({1.13 * k + 3.0 * std::sin(0.37 * k), -0.71 * k + 2.0 * std::cos(0.23 * k) - 2.0,
                        turnPerFrame * k, 1.0 + scalePerFrame * k, 1.0 + gainPerFrame * k, -0.4 * gainPerFrame * k,
                        noise});
    return path;
}

std::vector<Ref<Image>> Frames(const Texture &tex, const Path &path) {
    std::vector<Ref<Image>> frames;
    for (size_t k = 0; k < path.size(); ++k) frames.push_back(Frame(tex, path[k], 100 + static_cast<unsigned>(k)));
    return frames;
}

constexpr double kPattern = 21.0, kSearch = 61.0; // pixels
const double kPoints[][2] = {{80.5, 60.0}, {150.25, 100.7}, {110.0, 118.3}};

struct Tracked {
    std::vector<TrackResult> results; ///< per frame; the first the start
    std::vector<double> errors;       ///< pixels, per frame
    double mean = 0, worst = 0;       ///< over the tracked frames
};

/// Tracks the point (x, y) of frames[first] through the frames in order `step` (+1 or -1), each step starting
/// at the last answer kept; errors against the truth of `path` (for runs from frame 0).
Tracked TrackRun(const std::vector<Ref<Image>> &frames, const Path &path, double x, double y, TrackSettings settings,
                 int first = 0, int step = 1, double patternW = kPattern, double patternH = kPattern) {
    TrackPoint tp;
    tp.SetSearchArea(kSearch / kW, kSearch / kH);
    EXPECT_TRUE(tp.SetPattern(frames[first].Get(), x / kW, y / kH, patternW / kW, patternH / kH, first));
    Tracked run;
    run.results.resize(frames.size());
    run.errors.resize(frames.size());
    run.results[first] = {x / kW, y / kH, 0.0, true};
    TrackResult start = run.results[first], last;
    double sum = 0;
    int count = 0;
    for (int k = first + step; k >= 0 && k < static_cast<int>(frames.size()); k += step) {
        last = tp.Track(frames[k].Get(), k, start.x, start.y, settings);
        run.results[k] = last;
        // As the tool's adaptive gate does, a step that matched over 1 / 0.3 times worse than the run's mean
        // is dropped: the next step starts from the last one kept.
        if (count == 0 || count * last.match <= sum / 0.3) {
            if (last.found) start = last;
            if (last.match > 1.1920928955078125e-7) sum += last.match, ++count;
        }
        double tx, ty;
        Truth(path[k], x, y, tx, ty);
        const double e = last.found ? std::hypot(last.x * kW - tx, last.y * kH - ty) : INFINITY;
        run.errors[k] = e;
        run.mean += e / (frames.size() - 1);
        run.worst = std::max(run.worst, e);
    }
    return run;
}

TEST(TrackPoint, FollowsKnownMotionWithinStatedError) {
    using A = TrackSettings::Adaptive;
    struct Case {
        const char *name;
        double turn, scale, gain, noise;
        A mode;
        double meanLimit, worstLimit;
    } cases[] = {
        // Exact moved copies: what is left is the cubic interpolation's error on a texture of periods of 9 px
        // and longer, under a hundredth of a pixel; the limits leave a few times that.
        {"translation", 0, 0, 0, 0, A::None, 0.02, 0.05},
        // Gain 1 to 1.9 and an offset: correlation and refinement both fit gain and offset, so the error is
        // that of plain translation.
        {"brightness", 0, 0, 0.03, 0, A::None, 0.02, 0.05},
        // Independent noise of deviation 0.08 per frame, against waves of amplitude 0.06 to 0.12: the
        // 21 x 21 pattern averages it to a few hundredths of a pixel.
        {"noise", 0, 0, 0, 0.08, A::None, 0.06, 0.15},
        // 0.5 degree and 0.4 % scale a frame (15 degrees and 12 % at the end). The refinement fits the
        // pattern's turn and scale, so a kept pattern stays exact; EveryFrame adds each step's small error
        // to the next (a random walk).
        {"turn none", 0.5 * kPi / 180, 0.004, 0, 0, A::None, 0.02, 0.05},
        {"turn best match", 0.5 * kPi / 180, 0.004, 0, 0, A::BestMatch, 0.02, 0.05},
        {"turn every frame", 0.5 * kPi / 180, 0.004, 0, 0, A::EveryFrame, 0.06, 0.12},
        // 3 degrees a frame, 87 at the end: beyond what one pattern can follow; both adaptive modes take it
        // again often enough and keep the error of EveryFrame at a slow turn.
        {"fast every", 3 * kPi / 180, 0.004, 0, 0, A::EveryFrame, 0.06, 0.12},
        {"fast best", 3 * kPi / 180, 0.004, 0, 0, A::BestMatch, 0.06, 0.12},
    };
    const Texture tex(7);
    for (const Case &c : cases) {
        const Path path = MakePath(c.turn, c.scale, c.gain, c.noise);
        const std::vector<Ref<Image>> frames = Frames(tex, path);
        for (const auto &p : kPoints) {
            const Tracked run = TrackRun(frames, path, p[0], p[1], {.tracking = true, .adaptive = c.mode});
            EXPECT_LT(run.mean, c.meanLimit) << c.name << " point " << p[0] << "," << p[1];
            EXPECT_LT(run.worst, c.worstLimit) << c.name << " point " << p[0] << "," << p[1];
        }
    }
}

TEST(TrackPoint, SmallPatternsHoldOnSmoothTexture) {
    // Waves of 50 to 120 pixels and no blobs: in a 16 x 9 window the texture is close to a ramp, and a shift
    // along it looks to the correlation almost like a change of brightness. The plate turns 0.2 degree a frame
    // (6 at the end). The matcher must not slide along the ramp: every frame within 0.2 pixel.
    const Texture smooth(11, 50.0, 120.0, 0);
    const Path path = MakePath(0.2 * kPi / 180, 0, 0, 0);
    const std::vector<Ref<Image>> frames = Frames(smooth, path);
    for (const auto &p : kPoints) {
        const Tracked run = TrackRun(frames, path, p[0], p[1], {.tracking = true}, 0, 1, 16, 9);
        EXPECT_LT(run.worst, 0.2) << "point " << p[0] << "," << p[1];
    }
}

TEST(TrackPoint, AnotherProxyScaleTakesThePatternAgain) {
    // Frames 1 and 2 at half size (2 x 2 averages): the first takes the pattern again where it is asked to look,
    // the second is tracked at the new size against the truth.
    const Texture tex(7);
    const Path path = MakePath(0, 0, 0, 0);
    const auto half = [&](int k) {
        const Ref<Image> full = Frame(tex, path[k], 1);
        Ref<Image> small = MakeImage(kW / 2, kH / 2, DepthRGBAFlt32);
        for (int j = 0; j < kH / 2; ++j)
            for (int i = 0; i < kW / 2; ++i) {
                const float v = 0.25f * (full->GetFlt(2 * i, 2 * j).R + full->GetFlt(2 * i + 1, 2 * j).R +
                                         full->GetFlt(2 * i, 2 * j + 1).R + full->GetFlt(2 * i + 1, 2 * j + 1).R);
                small->PutFlt(i, j, {v, v, v, 1.f});
            }
        return small;
    };
    TrackPoint tp;
    tp.SetSearchArea(kSearch / kW, kSearch / kH);
    const double x = kPoints[0][0], y = kPoints[0][1];
    ASSERT_TRUE(tp.SetPattern(Frame(tex, path[0], 1).Get(), x / kW, y / kH, kPattern / kW, kPattern / kH, 0));
    TrackSettings settings;
    double tx, ty;
    Truth(path[1], x, y, tx, ty);
    const TrackResult taken = tp.Track(half(1).Get(), 1, tx / kW, ty / kH, settings);
    EXPECT_TRUE(taken.found);
    EXPECT_EQ(std::pair(taken.x, taken.y), std::pair(tx / kW, ty / kH));
    const TrackResult next = tp.Track(half(2).Get(), 2, taken.x, taken.y, settings);
    Truth(path[2], x, y, tx, ty);
    ASSERT_TRUE(next.found);
    EXPECT_LT(std::hypot(next.x * kW - tx, next.y * kH - ty), 0.1); // full-size pixels
}

TEST(TrackPoint, ReverseRetracesForwardPath) {
    const Texture tex(11);
    const Path path = MakePath(0, 0, 0, 0);
    const std::vector<Ref<Image>> frames = Frames(tex, path);
    const Tracked forward = TrackRun(frames, path, kPoints[0][0], kPoints[0][1], {});
    const TrackResult &end = forward.results.back();
    const Tracked back = TrackRun(frames, path, end.x * kW, end.y * kH, {}, kFrames - 1, -1);
    // Both runs carry the same small interpolation error; they agree within twice it.
    for (int k = 0; k < kFrames; ++k)
        EXPECT_LT(std::hypot((back.results[k].x - forward.results[k].x) * kW,
                             (back.results[k].y - forward.results[k].y) * kH),
                  0.1)
            << "frame " << k;
}

TEST(TrackPoint, MatchValueRisesUnderOcclusionAndAdaptiveModesRecover) {
    using A = TrackSettings::Adaptive;
    const Texture tex(5);
    const Path path = MakePath(0, 0, 0, 0);
    std::vector<Ref<Image>> frames = Frames(tex, path);
    const double px = kPoints[1][0], py = kPoints[1][1];
    constexpr int kFrom = 10, kTo = 14; // frames with a flat grey patch over the point
    for (int k = kFrom; k <= kTo; ++k) {
        double tx, ty;
        Truth(path[k], px, py, tx, ty);
        for (int j = -14; j <= 14; ++j)
            for (int i = -14; i <= 14; ++i) frames[k]->PutFlt(int(tx) + i, int(ty) + j, {0.5f, 0.5f, 0.5f, 1.f});
    }
    struct Case {
        A mode;
        float tolerance;
        bool recovers;
    } cases[] = {
        {A::None, 0.1f, true},
        {A::EveryFrame, 0.1f, true},
        {A::BestMatch, 0.1f, true},
        // Without a tolerance EveryFrame takes the patch as its pattern and loses the point for good.
        {A::EveryFrame, 2.f, false},
    };
    for (const Case &c : cases) {
        const Tracked run = TrackRun(frames, path, px, py, {.matchTolerance = c.tolerance, .adaptive = c.mode});
        const auto name = ::testing::Message() << "mode " << static_cast<int>(c.mode) << " tol " << c.tolerance;
        for (int k = 1; k < kFrom; ++k) EXPECT_LT(run.results[k].match, 0.01) << name << " frame " << k;
        EXPECT_GT(run.results[kFrom].match, 0.3) << name;
        double after = 0;
        for (int k = kTo + 3; k < kFrames; ++k) after = std::max(after, run.errors[k]);
        if (c.recovers)
            EXPECT_LT(after, 0.1) << name;
        else
            EXPECT_GT(after, 1.0) << name;
    }
}

TEST(TrackPoint, DepthsChannelsAndBadPixels) {
    const Texture tex(9), other(21);
    const Path path = MakePath(0, 0, 0, 0);
    const double x = kPoints[0][0], y = kPoints[0][1];
    struct Case {
        const char *name;
        int depth, channel;
        bool badPixels; ///< NaN and infinity in the search area, outside the pattern
        double limit;
    } cases[] = {
        {"float", DepthRGBAFlt32, -1, false, 0.08},
        {"half", DepthRGBAFlt16, -1, false, 0.08},
        {"16-bit", DepthRGBAInt16, -1, false, 0.08},
        // 8-bit steps of 1/255 on a texture of deviation 0.2: quantisation noise, still well under a tenth.
        {"8-bit", DepthRGBAInt8, -1, false, 0.1},
        {"mask", DepthAFlt32, -1, false, 0.08},
        {"red channel", DepthRGBAFlt32, 0, false, 0.08},
        // Green holds a still texture of its own: following green finds no motion.
        {"green channel", DepthRGBAFlt32, 1, false, 0.05},
        {"bad pixels", DepthRGBAFlt32, -1, true, 0.08},
    };
    for (const Case &c : cases) {
        std::vector<Ref<Image>> frames;
        for (int k : {0, 3}) {
            Ref<Image> f = Frame(tex, path[k], 0, c.depth);
            for (int j = 0; j < kH; ++j)
                for (int i = 0; i < kW; ++i) {
                    FltPixel p = f->GetFlt(i, j);
                    if (c.channel >= 0) p.G = static_cast<float>(other(i + 0.5, j + 0.5));
                    const double r = std::hypot(i - x, j - y);
                    if (c.badPixels && (i + j) % 7 == 0 && r > 20 && r < 30) p.R = p.G = p.B = (i % 2) ? NAN : INFINITY;
                    f->PutFlt(i, j, p);
                }
            frames.push_back(f);
        }
        TrackPoint tp;
        tp.SetChannel(c.channel);
        tp.SetSearchArea(kSearch / kW, kSearch / kH);
        ASSERT_TRUE(tp.SetPattern(frames[0].Get(), x / kW, y / kH, kPattern / kW, kPattern / kH, 0)) << c.name;
        TrackSettings s;
        const TrackResult r = tp.Track(frames[1].Get(), 3, x / kW, y / kH, s);
        ASSERT_TRUE(r.found) << c.name;
        double tx = x, ty = y;
        if (c.channel != 1) Truth(path[3], x, y, tx, ty);
        EXPECT_LT(std::hypot(r.x * kW - tx, r.y * kH - ty), c.limit) << c.name;
    }
}

TEST(TrackPoint, FailuresGiveNotFound) {
    const Texture tex(13);
    const Ref<Image> img = Frame(tex, Motion{}, 0);
    const Ref<Image> tiny = MakeImage(8, 8, DepthRGBAFlt32);
    const Ref<Image> flat = MakeImage(kW, kH, DepthRGBAFlt32);
    const double w = kPattern / kW, h = kPattern / kH;
    TrackSettings s;

    TrackPoint fresh;
    EXPECT_FALSE(fresh.Track(img.Get(), 0, 0.5, 0.5, s).found) << "no pattern";

    TrackPoint tp;
    tp.SetSearchArea(kSearch / kW, kSearch / kH);
    EXPECT_FALSE(tp.SetPattern(img.Get(), 0.5, 0.5, 1.2, h, 0)) << "pattern wider than the image";
    EXPECT_FALSE(tp.Track(img.Get(), 0, 0.5, 0.5, s).found) << "pattern unset by the failed SetPattern";
    EXPECT_FALSE(tp.SetPattern(img.Get(), 0.01, 0.5, w, h, 0)) << "pattern over the left edge";

    ASSERT_TRUE(tp.SetPattern(img.Get(), 0.5, 0.5, w, h, 0));
    EXPECT_FALSE(tp.Track(nullptr, 1, 0.5, 0.5, s).found) << "null image";
    EXPECT_FALSE(tp.Track(tiny.Get(), 1, 0.5, 0.5, s).found) << "a blank frame of another size: nothing to take";
    EXPECT_FALSE(tp.Track(img.Get(), 1, 3.0, 0.5, s).found) << "search area outside the image";
    EXPECT_FALSE(tp.Track(img.Get(), 1, 0.5, std::numeric_limits<double>::quiet_NaN(), s).found);
    tp.Reset();
    EXPECT_FALSE(tp.Track(img.Get(), 1, 0.5, 0.5, s).found) << "after Reset";

    ASSERT_TRUE(tp.SetPattern(flat.Get(), 0.5, 0.5, w, h, 0));
    EXPECT_FALSE(tp.Track(img.Get(), 1, 0.5, 0.5, s).found) << "a flat pattern has nothing to find";

    // Invalidate: the next Track takes the pattern there and answers that position; the one after, started
    // 4 pixels off in the same image, finds the exact copy.
    tp.Invalidate();
    const TrackResult taken = tp.Track(img.Get(), 2, 0.4, 0.45, s);
    EXPECT_TRUE(taken.found && taken.match == 0.0);
    const TrackResult again = tp.Track(img.Get(), 3, 0.4 + 4.0 / kW, 0.45 - 4.0 / kH, s);
    ASSERT_TRUE(again.found);
    EXPECT_NEAR(again.x * kW, 0.4 * kW, 1e-3);
    EXPECT_NEAR(again.y * kH, 0.45 * kH, 1e-3);
    EXPECT_LT(again.match, 1e-5);
}

TEST(TrackPoint, RectsCoverEverythingRead) {
    // With only the pixels of GetPatternRect and GetSearchRect present (the rest a wild canvas colour),
    // SetPattern and Track give what they give on the whole image.
    const Texture tex(17);
    const Path path = MakePath(0, 0, 0, 0);
    const Ref<Image> a = Frame(tex, path[0], 0), b = Frame(tex, path[4], 0);
    const double x = kPoints[2][0] / kW, y = kPoints[2][1] / kH;
    auto cropped = [](const Image &src, const ImgRectI &r) {
        const FltPixel wild{50.f, -50.f, 50.f, 1.f};
        Ref<Image> img = NewImageTagList({{ImgWidth, kW},
                                          {ImgHeight, kH},
                                          {ImgDepth, DepthRGBAFlt32},
                                          {ImgDataWindow, &r},
                                          {ImgCanvasColor, &wild}});
        img->AllocScanLineData();
        for (int j = r.y0; j < r.y1; ++j)
            for (int i = r.x0; i < r.x1; ++i) img->PutFlt(i, j, src.GetFlt(i, j));
        return img;
    };
    for (double size : {kPattern, 1.0}) { // 1 px asks for the smallest pattern, 3 x 3
        TrackPoint whole, part;
        TrackSettings s;
        for (TrackPoint *tp : {&whole, &part}) tp->SetSearchArea(kSearch / kW, kSearch / kH);
        ASSERT_TRUE(whole.SetPattern(a.Get(), x, y, size / kW, size / kH, 0));
        part.SetPattern(nullptr, x, y, size / kW, size / kH, 0);
        const ImgRectI pr = part.GetPatternRect(kW, kH);
        EXPECT_EQ(pr.Width(), std::max(3, static_cast<int>(size))) << size;
        ASSERT_TRUE(part.SetPattern(cropped(*a, pr).Get(), x, y, size / kW, size / kH, 0));
        const TrackResult rw = whole.Track(b.Get(), 4, x, y, s);
        const TrackResult rp = part.Track(cropped(*b, part.GetSearchRect(kW, kH, x, y)).Get(), 4, x, y, s);
        ASSERT_TRUE(rw.found && rp.found) << size;
        EXPECT_EQ(rw.x, rp.x) << size;
        EXPECT_EQ(rw.y, rp.y) << size;
        EXPECT_EQ(rw.match, rp.match) << size;
    }
}

} // namespace
} // namespace Orvane
