// Background in Gradient mode: the six shapes, offset, the three repeat
// modes and sub-pixel sampling (the mean of the samples' colours) against
// positions worked out here in double;
// coincident Start and End; interpolation spaces; premultiplication; integer
// clamping; fast interactive previews; masks.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>
#include <vector>

#include "host/color/ColorSpace.h"
#include "host/core/Tags.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/generate/BackgroundTestSupport.h"

namespace Orvane::BgTest {
namespace {

using BackgroundGradient = BackgroundSuite;

enum Shape { Linear, Reflect, Square, Cross, Radial, Angle };
const char *const kShapeIds[] = {"Linear", "Reflect", "Square", "Cross", "Radial", "Angle"};
enum Fold { Once, Repeat, PingPong };
const char *const kFoldIds[] = {"Once", "Repeat", "PingPong"};
const char *const kSubPixelIds[] = {"", "1x1", "2x2", "3x3", "4x4", "5x5"};

struct GradientCase {
    const char *name;
    Shape shape;
    double sx, sy, ex, ey; ///< Start and End as the controls hold them
    double offset;
    Fold fold;
    int subpixel;
};

/// One sample's gradient position, from the geometry in double.
struct Sample {
    double position; ///< after offset and folding
    bool nearJump;   ///< within rounding of a jump of the position
};

Sample SampleAt(const GradientCase &c, double aspect, double px, double py) {
    const double sx = c.sx, sy = c.sy * aspect, ex = c.ex, ey = c.ey * aspect;
    const double dx = ex - sx, dy = ey - sy, L2 = dx * dx + dy * dy, L = std::sqrt(L2);
    const double ox = px - sx, oy = py - sy;
    const double a = (dx * ox + dy * oy) / L2, b = (-dy * ox + dx * oy) / L2;
    const double radial = std::sqrt(std::pow(px / L - sx / L, 2) + oy * oy / L2);
    bool nearJump = false;
    double p = 0;
    switch (c.shape) {
    case Linear: p = a; break;
    case Reflect: p = std::fabs(a); break;
    case Square: p = std::max(std::fabs(a), std::fabs(b)); break;
    case Cross: p = std::min(std::fabs(a), std::fabs(b)); break;
    case Radial: p = radial; break;
    case Angle: {
        const double cosine = radial > 0 ? a / radial : 0.0;
        const double turn = std::acos(std::clamp(cosine, -1.0, 1.0)) / (2 * M_PI);
        p = b >= 0 ? turn : 1 - turn;
        // The angle jumps from 1 to 0 across the ray from Start towards End,
        // and near that line and its extension acos magnifies float rounding.
        nearJump = radial < 1e-4 || 1 - std::fabs(cosine) < 1e-4;
        break;
    }
    }
    p -= c.offset;
    if (c.fold == Repeat) {
        nearJump |= std::fabs(p - std::round(p)) < 1e-4;
        p -= std::floor(p);
    } else if (c.fold == PingPong) {
        p -= 2 * std::floor(p / 2);
        if (p > 1) p = 2 - p;
    }
    return {p, nearJump};
}

/// The pixel's value under the default black-to-white gradient: the mean of
/// the clamped positions of its n x n samples at (x + j/n, y + i/n) / (W, H),
/// the sample row's step added after the aspect scaling. False when a sample
/// lies on a jump, where float and double may fall on different sides.
/// With `device`, the device's form: positions against W - 1 and H - 1, the
/// row step added before the aspect scaling, and the colour read from the
/// 256-entry table (entry k at k/255) through a linear sampler over texel
/// centres, which for this ramp gives (256 t - 0.5) / 255, clamped.
bool ExpectedGrey(const GradientCase &c, int W, int H, int x, int y, double &value, bool device = false) {
    const int n = c.subpixel;
    const double aspect = double(H) / W;
    double sum = 0;
    for (int i = 0; i < n; ++i)
        for (int j = 0; j < n; ++j) {
            double px = (x + double(j) / n) / W, py = aspect * (double(y) / H) + double(i) / (n * H);
            if (device) px = (x + double(j) / n) / (W - 1), py = aspect * ((y + double(i) / n) / (H - 1));
            const Sample s = SampleAt(c, aspect, px, py);
            if (s.nearJump) return false;
            sum += device ? std::clamp((256.0 * s.position - 0.5) / 255.0, 0.0, 1.0) : std::clamp(s.position, 0.0, 1.0);
        }
    value = sum / (n * n);
    return true;
}

void SetUpGradient(Operator *op, const GradientCase &c) {
    SetID(op, "GradientType", kShapeIds[c.shape]);
    SetPoint(op, "Start", c.sx, c.sy);
    SetPoint(op, "End", c.ex, c.ey);
    SetNumber(op, "Offset", c.offset);
    SetID(op, "Repeat", kFoldIds[c.fold]);
    SetID(op, "SubPixel", kSubPixelIds[c.subpixel]);
}

// The first case is the tool's defaults, rendered without setting a control.
const GradientCase kCases[] = {
    {"linear, the defaults", Linear, 0.0, 0.5, 1.0, 0.5, 0.0, Once, 1},
    {"linear, diagonal, offset", Linear, 0.2, 0.1, 0.8, 0.9, 0.25, Once, 1},
    {"reflect", Reflect, 0.5, 0.5, 0.9, 0.6, 0.0, Once, 1},
    {"square", Square, 0.5, 0.4, 0.8, 0.5, 0.0, Once, 1},
    {"cross, negative offset", Cross, 0.5, 0.4, 0.8, 0.5, -0.1, Once, 1},
    {"radial: raw X, aspect-scaled Y offset", Radial, 0.4, 0.6, 0.7, 0.8, 0.0, Once, 1},
    {"angle", Angle, 0.5, 0.5, 0.9, 0.7, 0.0, Once, 1},
    {"angle pointing down-left", Angle, 0.6, 0.7, 0.2, 0.1, 0.0, Once, 1},
    {"linear repeat", Linear, 0.1, 0.5, 0.35, 0.5, 0.33, Repeat, 1},
    {"linear ping-pong", Linear, 0.1, 0.5, 0.35, 0.5, 0.3, PingPong, 1},
    {"linear once, far offset", Linear, 0.0, 0.5, 1.0, 0.5, -1.5, Once, 1},
    {"linear ping-pong, far offset", Linear, 0.0, 0.5, 1.0, 0.5, -1.5, PingPong, 1},
    {"linear repeat, far offset", Linear, 0.0, 0.5, 1.0, 0.5, -2.25, Repeat, 1},
    {"radial repeat", Radial, 0.5, 0.5, 0.6, 0.5, -0.2, Repeat, 1},
    {"angle ping-pong", Angle, 0.3, 0.2, 0.6, 0.9, 0.6, PingPong, 1},
    {"square 2x2", Square, 0.5, 0.5, 0.7, 0.6, 0.0, Once, 2},
    {"steep linear 3x3", Linear, 0.5, 0.5, 0.52, 0.5, 0.0, Once, 3},
    {"angle repeat 4x4", Angle, 0.5, 0.5, 0.8, 0.5, 0.1, Repeat, 4},
    {"small radial 5x5", Radial, 0.5, 0.5, 0.55, 0.5, 0.0, Once, 5},
    {"reflect ping-pong 3x3", Reflect, 0.45, 0.3, 0.5, 0.45, 1.2, PingPong, 3},
};

TEST_F(BackgroundGradient, EachShapeFoldAndSubPixelGridMatchesTheGeometry) {
    const int W = 40, H = 24; // aspect 0.6, so that Y scaling matters
    Frame(W, H, "Gradient");
    for (const GradientCase &c : kCases) {
        SCOPED_TRACE(c.name);
        if (&c != kCases) SetUpGradient(bg, c);
        Ref<Image> img = EvalImage(bg);
        ASSERT_TRUE(img);
        int checked = 0;
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) {
                double want;
                if (!ExpectedGrey(c, W, H, x, y, want)) continue;
                ++checked;
                const FltPixel p = img->GetFlt(x, y);
                ASSERT_NEAR(p.R, want, 2e-5) << x << "," << y;
                ASSERT_NEAR(p.G, want, 2e-5) << x << "," << y;
                ASSERT_NEAR(p.B, want, 2e-5) << x << "," << y;
                ASSERT_EQ(p.A, 1.0f) << x << "," << y;
            }
        EXPECT_GT(checked, W * H * 9 / 10);
    }
}

TEST_F(BackgroundGradient, OnTheDeviceEachCaseFollowsTheDeviceGeometry) {
    ORVANE_NEED_OPENCL(ctx);
    const int W = 40, H = 24;
    Frame(W, H, "Gradient");
    for (const GradientCase &c : kCases) {
        SCOPED_TRACE(c.name);
        SetUpGradient(bg, c);
        RenderTask task;
        task.SetDevice(ctx);
        EvalOptions opt;
        opt.task = &task;
        opt.useCache = false;
        const int launches = ctx->LaunchCount();
        Ref<Image> img = Render(bg, opt);
        ASSERT_TRUE(img);
        EXPECT_EQ(ctx->LaunchCount(), launches + 1);
        int checked = 0;
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) {
                double want;
                if (!ExpectedGrey(c, W, H, x, y, want, true)) continue;
                ++checked;
                const FltPixel p = img->GetFlt(x, y);
                ASSERT_NEAR(p.R, want, 5e-5) << x << "," << y;
                ASSERT_NEAR(p.B, want, 5e-5) << x << "," << y;
                ASSERT_NEAR(p.A, 1.0f, 1e-6) << x << "," << y;
            }
        EXPECT_GT(checked, W * H * 9 / 10);
    }
}

TEST_F(BackgroundGradient, CoincidentStartAndEndGiveTheColourAtZeroEverywhere) {
    // Red at -1, blue at 1: position 0 is their midpoint. Offset and folding
    // would move it anywhere else.
    SetGradient(bg, {{-1.0, 1, 0, 0, 1}, {1.0, 0, 0, 1, 1}});
    Frame(12, 7, "Gradient");
    SetPoint(bg, "Start", 0.3, 0.3);
    SetPoint(bg, "End", 0.3, 0.3);
    SetNumber(bg, "Offset", 0.25);
    SetID(bg, "Repeat", "PingPong");
    SetID(bg, "SubPixel", "3x3");
    for (const char *shape : {"Linear", "Radial", "Angle"})
        for (int depthChoice : {4, 2}) {
            SCOPED_TRACE(std::string(shape) + " depth " + std::to_string(depthChoice));
            SetID(bg, "GradientType", shape);
            SetNumber(bg, "Depth", depthChoice);
            Ref<Image> img = EvalImage(bg);
            ASSERT_TRUE(img);
            for (int y = 0; y < 7; ++y)
                for (int x = 0; x < 12; ++x) {
                    if (depthChoice == 4) {
                        EXPECT_EQ(img->GetFlt(x, y), (FltPixel{0.5f, 0.0f, 0.5f, 1.0f})) << x << "," << y;
                    } else { // 0.5 x 65535 = 32767.5, truncated
                        const int want[4] = {32767, 0, 32767, 65535};
                        for (int ch = 0; ch < 4; ++ch) EXPECT_EQ(StoredInt(*img, x, y, ch), want[ch]);
                    }
                }
        }
}

TEST_F(BackgroundGradient, InterpolationSpaceReachesTheGradient) {
    // Red to blue: RGB passes through a dark purple, HSV and HLS through
    // magenta, LAB through its own blend.
    const Ref<Gradient> reference = MakeRef<Gradient>(std::vector<GradientStop>{{0.0, 1, 0, 0, 1}, {1.0, 0, 0, 1, 1}});
    SetGradient(bg, reference->Stops());
    Frame(64, 4, "Gradient");
    SetPoint(bg, "Start", 0.0, 0.5);
    SetPoint(bg, "End", 1.0, 0.5);
    const std::pair<const char *, ColorSpaceType> spaces[] = {{"RGB", ColorSpaceType::RGB},
                                                              {"HLS", ColorSpaceType::HLS},
                                                              {"HSV", ColorSpaceType::HSV},
                                                              {"LAB", ColorSpaceType::LAB}};
    std::vector<FltPixel> middles;
    for (const auto &[id, space] : spaces) {
        SCOPED_TRACE(id);
        SetID(bg, "GradientInterpolationMethod", id);
        Ref<Image> img = EvalImage(bg);
        ASSERT_TRUE(img);
        for (int x : {0, 8, 16, 32, 40, 63}) { // x / 64 is exact in float
            float r, g, b, a;
            reference->QuickEvaluate(x / 64.0, r, g, b, a, static_cast<int>(space));
            const FltPixel p = img->GetFlt(x, 1);
            EXPECT_NEAR(p.R, r, 1e-6) << x;
            EXPECT_NEAR(p.G, g, 1e-6) << x;
            EXPECT_NEAR(p.B, b, 1e-6) << x;
            EXPECT_NEAR(p.A, a, 1e-6) << x;
        }
        middles.push_back(img->GetFlt(32, 1));
    }
    // HSV's middle is magenta (1, 0, 1); RGB's is (0.5, 0, 0.5).
    EXPECT_NEAR(middles[0].R, 0.5f, 1e-6);
    EXPECT_NEAR(middles[2].R, 1.0f, 1e-5);
    EXPECT_NEAR(middles[2].B, 1.0f, 1e-5);
    EXPECT_GT(std::fabs(middles[3].R - middles[0].R) + std::fabs(middles[3].B - middles[0].B), 0.05);
}

TEST_F(BackgroundGradient, StraightGradientColoursArePremultiplied) {
    SetGradient(bg, {{0.0, 0.8f, 0.4f, 0.2f, 0.5f}, {1.0, 0.2f, 0.6f, 1.0f, 0.25f}});
    Frame(32, 4, "Gradient");
    SetPoint(bg, "Start", 0.0, 0.5);
    SetPoint(bg, "End", 1.0, 0.5);
    Ref<Image> img = EvalImage(bg);
    ASSERT_TRUE(img);
    EXPECT_FALSE(img->IsOpaque());
    const double c0[4] = {0.8, 0.4, 0.2, 0.5}, c1[4] = {0.2, 0.6, 1.0, 0.25};
    for (int x = 0; x < 32; ++x) {
        const double t = x / 32.0;
        const double alpha = c0[3] + (c1[3] - c0[3]) * t;
        const FltPixel p = img->GetFlt(x, 2);
        for (int ch = 0; ch < 3; ++ch)
            EXPECT_NEAR(Channel(p, ch), (c0[ch] + (c1[ch] - c0[ch]) * t) * alpha, 1e-6) << x << " ch " << ch;
        EXPECT_NEAR(p.A, alpha, 1e-6) << x;
    }
}

TEST_F(BackgroundGradient, IntegerImagesClampAndTruncateFloatImagesDoNot) {
    // One stop: the same colour at every position, beyond 0..1 in two channels.
    SetGradient(bg, {{0.0, 2.0f, -1.0f, 0.5f, 1.0f}});
    Frame(9, 5, "Gradient");
    SetID(bg, "GradientType", "Radial");
    struct Case {
        int depthChoice;
        double want[4];
    };
    const Case cases[] = {{4, {2.0, -1.0, 0.5, 1.0}},
                          {3, {2.0, -1.0, 0.5, 1.0}},
                          {2, {65535, 0, 32767, 65535}},
                          {1, {255, 0, double(To8(32767)), 255}}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.depthChoice);
        SetNumber(bg, "Depth", c.depthChoice);
        Ref<Image> img = EvalImage(bg);
        ASSERT_TRUE(img);
        for (int ch = 0; ch < 4; ++ch) {
            const double got = c.depthChoice >= 3 ? Channel(img->GetFlt(4, 2), ch) : StoredInt(*img, 4, 2, ch);
            EXPECT_EQ(got, c.want[ch]) << "ch " << ch;
        }
    }
}

TEST_F(BackgroundGradient, IntegerRampsTruncateTheSampledColour) {
    const GradientCase c{"", Linear, 0.1, 0.2, 0.9, 0.7, 0.0, Once, 2};
    const int W = 50, H = 20;
    Frame(W, H, "Gradient");
    SetUpGradient(bg, c);
    SetNumber(bg, "Depth", 2);
    Ref<Image> img = EvalImage(bg);
    ASSERT_TRUE(img);
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) {
            double want;
            ASSERT_TRUE(ExpectedGrey(c, W, H, x, y, want));
            ASSERT_NEAR(StoredInt(*img, x, y, 0), std::floor(want * 65535.0), 1.0) << x << "," << y;
            ASSERT_EQ(StoredInt(*img, x, y, 3), 65535);
        }
}

TEST_F(BackgroundGradient, FastInteractivePreviewsSkipTheSubPixelGrid) {
    Frame(24, 12, "Gradient");
    SetUpGradient(bg, {"", Radial, 0.5, 0.5, 0.6, 0.5, 0.0, Repeat, 3});
    EvalOptions plain;
    plain.useCache = false;
    Ref<Image> fine = Render(bg, plain);
    RenderTask interactive, batch;
    interactive.interactive = true;
    EvalOptions quick = plain, quickBatch = plain;
    quick.flags = quickBatch.flags = ReqFlagQuick;
    quick.task = &interactive;
    quickBatch.task = &batch;
    Ref<Image> preview = Render(bg, quick), batchQuick = Render(bg, quickBatch);
    SetID(bg, "SubPixel", "1x1");
    Ref<Image> coarse = Render(bg, plain);
    ASSERT_TRUE(fine && preview && batchQuick && coarse);
    const size_t bytes = fine->RowBytes();
    bool fineDiffers = false;
    for (int y = 0; y < 12; ++y) {
        EXPECT_EQ(0, std::memcmp(preview->ScanLine(y), coarse->ScanLine(y), bytes)) << y;
        EXPECT_EQ(0, std::memcmp(batchQuick->ScanLine(y), fine->ScanLine(y), bytes)) << y;
        fineDiffers |= std::memcmp(fine->ScanLine(y), coarse->ScanLine(y), bytes) != 0;
    }
    EXPECT_TRUE(fineDiffers);
    EXPECT_EQ(preview->Attrs().GetLong(ImgQuickMode), 1);
}

TEST_F(BackgroundGradient, MasksHoldTheGradientAlpha) {
    SetGradient(bg, {{0.0, 1, 1, 1, 0}, {1.0, 1, 1, 1, 1}});
    const GradientCase c{"", Linear, 0.1, 0.5, 0.9, 0.5, 0.0, Once, 1};
    const int W = 30, H = 6;
    for (int depth = 1; depth <= 4; ++depth) {
        SCOPED_TRACE(depth);
        doc.SetPref(PREF_FFDepth, depth);
        Frame(W, H, "Gradient");
        SetUpGradient(bg, c);
        EvalOptions opt;
        opt.useCache = false; // the document's depth is not part of the cache key
        Ref<Image> img = Render(bg, opt);
        ASSERT_TRUE(img);
        ASSERT_EQ(img->Depth(), depth);
        EXPECT_FALSE(img->IsOpaque());
        for (int x = 0; x < W; ++x) {
            double want;
            ASSERT_TRUE(ExpectedGrey(c, W, H, x, 3, want));
            if (depth == 2)
                EXPECT_NEAR(StoredInt(*img, x, 3, 3), std::floor(want * 65535.0), 1.0) << x;
            else if (depth == 1)
                EXPECT_NEAR(StoredInt(*img, x, 3, 3), want * 255.0, 1.0) << x;
            else
                EXPECT_NEAR(img->GetFlt(x, 3).A, want, depth == 3 ? 1e-3 : 2e-5) << x;
        }
    }
}

} // namespace
} // namespace Orvane::BgTest
