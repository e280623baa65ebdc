// BrightnessContrast against an independent model of its steps (double for float, whole numbers for 16-bit),
// edge settings, the processing frame, and the device against the rows.
#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "host/app/Application.h"
#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/Link.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/krom/GPUMemory.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::bctest {
namespace {
using Px = std::array<double, 4>;

/// The tool's inputs (defaults as the tool declares them).
struct Settings {
    double gain = 1.0, lift = 0.0, gamma = 1.0, contrast = 0.0, bright = 0.0, sat = 1.0;
    double low = 0.0, high = 1.0;
    bool red = true, green = true, blue = true, alpha = false;
    bool reverse = false, clipBlack = false, clipWhite = false, prePost = false;
};

/// The tool's inputs with their values under `s`.
std::vector<std::pair<const char *, double>> Values(const Settings &s) {
    const char *const ids[] = {
        "Gain", "Lift",  "Gamma", "Contrast", "Brightness", "Saturation", "Low",       "High",
        "Red",  "Green", "Blue",  "Alpha",    "Direction",  "ClipBlack",  "ClipWhite", "PreDividePostMultiply"};
    const double values[] = {s.gain,         s.lift,        s.gamma,         s.contrast,        s.bright,
                             s.sat,          s.low,         s.high,          1.0 * s.red,       1.0 * s.green,
                             1.0 * s.blue,   1.0 * s.alpha, 1.0 * s.reverse, 1.0 * s.clipBlack, 1.0 * s.clipWhite,
                             1.0 * s.prePost};
    std::vector<std::pair<const char *, double>> out;
    for (size_t i = 0; i < std::size(ids); ++i) out.emplace_back(ids[i], values[i]);
    return out;
}

void Apply(Operator *bc, const Settings &s) { Test::SetNumbers(bc, Values(s)); }

/// Sets the application's power and row switches for a scope.
struct AppSwitches {
    const bool fast = GetApp()->GetAttrB(AppFastPower), vector = GetApp()->GetAttrB(AppVectorRows);
    AppSwitches(bool fastPower, bool vectorRows) {
        GetApp()->SetAttrsTagList({{AppFastPower, fastPower}, {AppVectorRows, vectorRows}});
    }
    ~AppSwitches() { GetApp()->SetAttrsTagList({{AppFastPower, fast}, {AppVectorRows, vector}}); }
};

/// A document with an image source feeding a BrightnessContrast tool.
struct Rig {
    OrvaneDoc doc;
    Test::ImageSourceTool *source;
    Operator *bc;
    explicit Rig(Ref<Image> img) : source(Test::AddImageSource(doc, "Src", std::move(img))), bc(AddAfter(source)) {}
    /// A tool fed by `upstream`.
    Operator *AddAfter(Operator *upstream) {
        Operator *next = doc.AddTool(OvID("BrightnessContrast"));
        EXPECT_TRUE(next && next->FindInput("Input")->ConnectTo(upstream->FindMainOutput()));
        return next;
    }
};

/// Renders a tool's main output without the result cache (on `device` when given).
Ref<Image> Render(Operator *op, const ImgRectI *roi = nullptr, uint32_t flags = 0, IDeviceContext *device = nullptr,
                  RenderTask *task = nullptr) {
    RenderTask own;
    RenderTask &t = task ? *task : own;
    t.SetDevice(device);
    EvalOptions opt;
    opt.task = &t, opt.flags = flags, opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    return Test::EvalImage(op, 0.0, opt);
}

Px ToPx(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }

/// The stored 16-bit value of channel c at (x, y) (8-bit data widened by 257;
/// a mask gives its one value for every channel).
int64_t Stored16(const Image &img, int x, int y, int c) {
    const int i = x - img.DataWindow().x0;
    switch (img.Depth()) {
    case DepthRGBAInt8: return img.Row<uint8_t>(y)[4 * i + c] * 257;
    case DepthRGBAInt16: return img.Row<uint16_t>(y)[4 * i + c];
    case DepthAInt8: return img.Row<uint8_t>(y)[i] * 257;
    case DepthAInt16: return img.Row<uint16_t>(y)[i];
    default: ADD_FAILURE() << "not an integer depth"; return 0;
    }
}

// ---- the model ----

constexpr double kEps = 1.1920929e-07;

/// `x` rounded to a 32-bit float. Out of line on purpose: GCC 12 at -O2 and
/// above drops the rounding when it packs two double -> float -> double round
/// trips into one vector operation.
[[gnu::noinline]] double AsFloat(double x) { return static_cast<float>(x); }

/// What the model derives from the settings.
struct Model {
    Settings s;
    bool on[4];
    bool doGamma, doSat, useLowHigh;
    double gain, exponent, finalContrast, finalScale, sat, oneMinusSat;
    double satMat[3][3]; ///< forward: the saturation matrix; reverse: its inverse
    bool truePower;

    explicit Model(const Settings &st, bool fastPower = true)
        : s(st), on{s.red, s.green, s.blue, s.alpha}, truePower(fastPower) {
        doGamma = std::fabs(s.gamma - 1.0) >= kEps;
        doSat = std::fabs(1.0 - s.sat) >= kEps;
        useLowHigh = std::fabs(s.low) >= kEps || std::fabs(s.high - 1.0) >= kEps;
        // The tool holds its derived values as 32-bit floats; the model rounds
        // them the same way and does its own arithmetic in double.
        sat = AsFloat(s.sat), oneMinusSat = AsFloat(1.0 - s.sat);
        const double contrast = AsFloat(s.contrast + 1.0), range = AsFloat(s.high - s.low);
        const double oneOverGamma = s.gamma < 1e-5 ? 100000.0 : 1.0 / s.gamma;
        if (!s.reverse) {
            gain = AsFloat(s.gain - s.lift), exponent = AsFloat(oneOverGamma);
            finalContrast = contrast, finalScale = range >= kEps ? AsFloat(1.0 / range) : 0.0;
        } else {
            gain = s.gain - s.lift == 0.0 ? 1.0 : AsFloat(1.0 / (s.gain - s.lift)), exponent = AsFloat(s.gamma);
            finalContrast = contrast == 0.0 ? 1.0 : AsFloat(1.0 / contrast), finalScale = range;
        }
        // RGB -> Y Cb Cr, chroma times the saturation, back to RGB; a channel that is off keeps its value.
        const double toYC[3][3] = {
            {0.299, 0.587, 0.114}, {-0.16873589, -0.33126414, 0.5}, {0.5, -0.4186876, -0.08131241}};
        const double toRGB[3][3] = {{1.0, 0.0, 1.402}, {1.0, -0.34413627, -0.71413624}, {1.0, 1.772, 0.0}};
        const double scale[3] = {1.0, s.sat, s.sat};
        double m[3][3];
        for (int i = 0; i < 3; ++i)
            for (int j = 0; j < 3; ++j) {
                m[i][j] = 0.0;
                for (int k = 0; k < 3; ++k) m[i][j] += toRGB[i][k] * scale[k] * toYC[k][j];
                if (!on[i]) m[i][j] = i == j;
            }
        // Reverse: the inverse by cofactors; a singular matrix turns the saturation step off.
        const double det = m[0][0] * (m[1][1] * m[2][2] - m[1][2] * m[2][1]) -
                           m[0][1] * (m[1][0] * m[2][2] - m[1][2] * m[2][0]) +
                           m[0][2] * (m[1][0] * m[2][1] - m[1][1] * m[2][0]);
        const bool singular = s.reverse && std::fabs(det) < kEps;
        doSat = doSat && !singular;
        for (int i = 0; i < 3; ++i)
            for (int j = 0; j < 3; ++j) {
                const int r0 = (j + 1) % 3, r1 = (j + 2) % 3, c0 = (i + 1) % 3, c1 = (i + 2) % 3;
                const double inverse = (m[r0][c0] * m[r1][c1] - m[r0][c1] * m[r1][c0]) / det;
                satMat[i][j] = !s.reverse ? m[i][j] : singular ? double(i == j) : inverse;
            }
    }

    double Power(double x) const {
        if (truePower) return std::copysign(std::pow(std::fabs(x), exponent), x);
        return std::pow(std::max(x, 0.0), exponent); // the table reads negative values as 0
    }

    /// Calls f(c) for each chosen channel below n.
    template <class F> void Each(int n, F f) const {
        for (int c = 0; c < n; ++c)
            if (on[c]) f(c);
    }

    /// The float steps, one pixel.
    Px Float(Px p) const {
        const double k = std::fabs(p[3]) < kEps ? 0.0 : 1.0 / p[3];
        if (s.prePost) Each(3, [&](int c) { p[c] *= k; });
        if (!s.reverse) {
            Each(4, [&](int c) {
                const double x = gain * p[c] + s.lift;
                p[c] = ((doGamma ? Power(x) : x) - 0.5) * finalContrast + 0.5 + s.bright;
            });
            const double y = 0.299 * p[0] + 0.587 * p[1] + 0.114 * p[2];
            if (doSat) Each(3, [&](int c) { p[c] = p[c] * sat + y * oneMinusSat; });
            if (useLowHigh) Each(4, [&](int c) { p[c] = (p[c] - s.low) * finalScale; });
        } else {
            if (useLowHigh) Each(4, [&](int c) { p[c] = finalScale * p[c] + s.low; });
            const Px old = p;
            if (doSat)
                Each(3, [&](int c) { p[c] = satMat[c][0] * old[0] + satMat[c][1] * old[1] + satMat[c][2] * old[2]; });
            Each(4, [&](int c) {
                const double x = (p[c] - s.bright - 0.5) * finalContrast + 0.5;
                p[c] = ((doGamma ? Power(x) : x) - s.lift) * gain;
            });
        }
        if (s.prePost) Each(3, [&](int c) { p[c] *= p[3]; });
        Each(4, [&](int c) { p[c] = std::clamp(p[c], s.clipBlack ? 0.0 : -HUGE_VAL, s.clipWhite ? 1.0 : HUGE_VAL); });
        return p;
    }

    /// The 16-bit steps, one pixel of values 0..65535.
    std::array<int64_t, 4> Int(std::array<int64_t, 4> p) const {
        auto clamp16 = [](double v) { return static_cast<int64_t>(std::clamp(v, 0.0, 65535.0)); };
        auto round16 = [](double v) { return static_cast<int64_t>(std::floor(std::clamp(v, 0.0, 65535.0) + 0.5)); };
        // Cut from the float values the tool holds.
        const double liftI = std::trunc(AsFloat(s.lift) * 65535.0), brightI = std::trunc(AsFloat(s.bright) * 65535.0);
        const double lowI = std::trunc(AsFloat(s.low) * 65535.0), highI = std::trunc(AsFloat(s.high) * 65535.0);
        const double contrastI = std::trunc(finalContrast * 16384.0);
        const bool lowHigh = lowI != 0.0 || highI != 65535.0;
        auto table = [&](int64_t x) { return doGamma ? round16(std::pow(x / 65535.0, exponent) * 65535.0) : x; };
        auto contrast = [&](double d) { return std::floor(d * contrastI / 16384.0); };
        if (s.prePost) {
            if (p[3] == 0) {
                Each(3, [&](int c) { p[c] = 0; });
                if (!on[3]) return p;
            } else {
                Each(3, [&](int c) { p[c] = std::min<int64_t>(65535, p[c] * 65535 / p[3]); });
            }
        }
        if (!s.reverse) {
            Each(4, [&](int c) {
                const int64_t x = table(clamp16(std::trunc(p[c] * gain) + liftI));
                p[c] = clamp16(contrast(x - 32768.0) + brightI + 32768.0);
            });
            const double y = 0.299 * p[0] + 0.587 * p[1] + 0.114 * p[2];
            if (doSat) Each(3, [&](int c) { p[c] = round16(p[c] * sat + y * oneMinusSat); });
            if (lowHigh) Each(4, [&](int c) { p[c] = clamp16(std::trunc((p[c] - lowI) * finalScale)); });
        } else {
            if (lowHigh) Each(4, [&](int c) { p[c] = clamp16(std::trunc(finalScale * p[c]) + lowI); });
            const auto old = p;
            if (doSat)
                Each(3, [&](int c) {
                    p[c] = round16(satMat[c][0] * old[0] + satMat[c][1] * old[1] + satMat[c][2] * old[2]);
                });
            Each(4, [&](int c) {
                const int64_t x = table(clamp16(contrast(p[c] - brightI - 32768.0) + 32768.0));
                p[c] = clamp16(std::trunc((x - liftI) * gain));
            });
        }
        if (s.prePost) Each(3, [&](int c) { p[c] = static_cast<int64_t>(std::floor(p[c] * p[3] / 65535.0 + 0.5)); });
        return p;
    }
};

class BrightnessContrast : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};
using BrightnessContrastDevice = BrightnessContrast;

// Settings that cover each step alone and together. The ones without gamma or
// pre-divide take the matrix route (and on float only without clipping).
const std::pair<const char *, Settings> kSettings[] = {
    {"gain and lift", {.gain = 1.7, .lift = 0.1}},
    {"gamma", {.gamma = 1.6}},
    {"gamma below one, negative lift", {.gain = 1.2, .lift = -0.05, .gamma = 0.6}},
    {"contrast and brightness", {.contrast = 0.4, .bright = -0.1}},
    {"saturation", {.sat = 0.3}},
    {"saturation, green off", {.sat = 1.8, .green = false}},
    {"low and high", {.low = 0.1, .high = 0.8}},
    {"every step",
     {.gain = 1.3, .lift = .05, .gamma = 1.4, .contrast = .25, .bright = .05, .sat = .6, .low = .05, .high = .9}},
    {"every step, blue and alpha",
     {.gain = 0.8, .gamma = 0.7, .contrast = -0.3, .sat = 1.5, .high = 0.7, .green = false, .alpha = true}},
    {"pre-divide", {.gain = 1.2, .gamma = 1.3, .sat = 0.5, .prePost = true}},
    {"pre-divide, alpha processed", {.gain = 1.1, .lift = 0.02, .gamma = 0.8, .alpha = true, .prePost = true}},
    {"clip both", {.gain = 1.5, .lift = -0.2, .clipBlack = true, .clipWhite = true}},
    {"clip with gamma, alpha too",
     {.gamma = 2.0, .contrast = 0.5, .alpha = true, .clipBlack = true, .clipWhite = true}},
    {"alpha only", {.gain = 2.0, .sat = 0.3, .red = false, .green = false, .blue = false, .alpha = true}},
    // Values whose 32-bit float lies just under a whole 16-bit step: the
    // 16-bit forms are cut from the float.
    {"lift and brightness on 16-bit steps", {.lift = 1000.0 / 65535.0, .gamma = 1.1, .bright = 1004.0 / 65535.0}},
};

/// How a float result may differ from the model: float arithmetic against
/// double, the gamma table's accuracy, and the rounding of the stored depth.
double FloatTolerance(int depth, double expected, bool table, bool prePost) {
    double tol = 2e-5 * (1.0 + std::fabs(expected));
    // The table is exact to about 1e-6 on 0..1; after pre-divide the curve's
    // result is multiplied by colours that may be many times their stored size.
    if (table) tol += prePost ? 4e-5 : 4e-6;
    if (depth == DepthRGBAFlt16 || depth == DepthAFlt16) tol += std::fabs(expected) * (1.0 / 2048.0);
    return tol;
}

/// Compares every pixel of `out` with the model applied to `in`.
void ExpectModel(const Model &model, const Image &in, const Image &out, const std::string &what) {
    ASSERT_EQ(out.DataWindow(), in.DataWindow()) << what;
    const ImgRectI dw = out.DataWindow();
    const int depth = out.Depth();
    const bool eight = depth == DepthRGBAInt8 || depth == DepthAInt8;
    // Integer rows take the 16-bit steps themselves. The matrix route scales in float and rounds once where the
    // steps cut: within a few units.
    const bool rows = model.doGamma || model.s.prePost;
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x)
            for (int c = out.IsMask() ? 3 : 0; c < 4; ++c) {
                double got, expected, tol;
                if (out.IsFloat()) {
                    expected = model.Float(ToPx(in.GetFlt(x, y)))[c];
                    got = ToPx(out.GetFlt(x, y))[c];
                    tol = FloatTolerance(depth, expected, !model.truePower, model.s.prePost);
                } else {
                    std::array<int64_t, 4> p;
                    for (int k = 0; k < 4; ++k) p[k] = Stored16(in, x, y, k);
                    const double e16 = static_cast<double>(model.Int(p)[c]);
                    expected = eight ? std::floor(e16 * 255.0 / 65535.0 + 0.5) : e16;
                    got = eight ? Stored16(out, x, y, c) / 257.0 : Stored16(out, x, y, c);
                    tol = rows ? 0.0 : eight ? 1.0 : 4.0;
                }
                ASSERT_NEAR(got, expected, tol) << what << " at " << x << "," << y << " channel " << c;
            }
}

TEST_F(BrightnessContrast, MatchesModelOnEveryDepthAndRowFunction) {
    // Power switch, vector rows; integer depths read gamma from their table in every mode: one run is enough.
    const std::tuple<const char *, bool, bool> modes[] = {
        {"vector rows", true, true}, {"general rows", true, false}, {"gamma table", false, true}};
    for (const auto &[mode, fastPower, vectorRows] : modes) {
        AppSwitches switches(fastPower, vectorRows);
        for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthAFlt32, DepthAFlt16, DepthRGBAInt16, DepthRGBAInt8,
                          DepthAInt16, DepthAInt8}) {
            if (!FormatOfDepth(depth).isFloat && !(fastPower && vectorRows)) continue;
            Ref<Image> src = Orvane::Test::PatternImage(37, 11, depth, 7);
            Rig rig(src);
            for (const auto &[name, forward] : kSettings)
                for (bool reverse : {false, true}) {
                    Settings s = forward;
                    s.reverse = reverse;
                    Apply(rig.bc, s);
                    Ref<Image> out = Render(rig.bc);
                    const std::string what = std::string(name) + (reverse ? " reverse" : " forward") + ", depth " +
                                             std::to_string(depth) + ", " + mode;
                    ASSERT_TRUE(out) << what;
                    ExpectModel(Model(s, fastPower), *src, *out, what);
                }
        }
    }
}

TEST_F(BrightnessContrast, EdgeSettings) {
    struct Edge {
        const char *name;
        FltPixel in, expected;
        bool fastPower;
        Settings s;
    };
    // 0.99999 to the power 100000: about 1/e, where a larger exponent gives 0.
    const float kNearOne = static_cast<float>(std::pow(static_cast<double>(0.99999f), 100000.0));
    const FltPixel a{0.5f, 0.99999f, 1.0f, 0.3f}, b{0.1f, 0.5f, 1.9f, 0.7f}, c{1.f, 0.25f, -0.5f, 1.f};
    const FltPixel tiny{1e-8f, 1e-8f, 1e-8f, 1e-8f}, signs{-0.5f, 0.5f, -2.f, 1.f};
    const Settings alphaOnly{.gain = 2, .sat = 0.3, .red = false, .green = false, .blue = false, .alpha = true};
    const Settings contrastBack{.contrast = -1, .bright = 0.1, .reverse = true};
    const Settings tinyAlpha{.gain = 2.0, .lift = 0.5, .alpha = true, .prePost = true};
    const Edge edges[] = {
        {"alpha only: saturation leaves alpha", {0.2f, 0.4f, 0.6f, 0.5f}, {0.2f, 0.4f, 0.6f, 1.f}, true, alphaOnly},
        {"gamma 0 forward: exponent 100000", a, {0.f, kNearOne, 1.f, 0.3f}, true, {.gamma = 0.0}},
        {"gamma 0 forward, table", a, {0.f, kNearOne, 1.f, 0.3f}, false, {.gamma = 0.0}},
        {"high equals low forward", b, {0.f, 0.f, 0.f, 0.7f}, true, {.low = 0.4, .high = 0.4}},
        {"high equals low reverse", b, {0.4f, 0.4f, 0.4f, 0.7f}, true, {.low = 0.4, .high = 0.4, .reverse = true}},
        {"gain equals lift forward", b, {0.3f, 0.3f, 0.3f, 0.7f}, true, {.gain = 0.3, .lift = 0.3}},
        {"gain = lift reverse: 1", b, {-0.2f, 0.2f, 1.6f, 0.7f}, true, {.gain = 0.3, .lift = 0.3, .reverse = true}},
        {"contrast -1 forward", b, {0.6f, 0.6f, 0.6f, 0.7f}, true, {.contrast = -1.0, .bright = 0.1}},
        {"contrast -1 reverse: 1", b, {0.f, 0.4f, 1.8f, 0.7f}, true, contrastBack},
        {"pre-divide, alpha 0", {.3f, .5f, .7f, 0}, {}, true, {.gain = 2, .lift = .1, .gamma = 1.2, .prePost = true}},
        {"pre-divide, alpha below eps", tiny, {0.f, 0.f, 0.f, 1e-8f}, true, {.gain = 2, .lift = 0.1, .prePost = true}},
        // Processed alpha grows from the lift, so the colours show that they
        // started from 0: lift times the new alpha.
        {"pre-divide, alpha below eps, processed", tiny, {0.25f, 0.25f, 0.25f, 0.5f}, true, tinyAlpha},
        {"negative stays negative with true powers", signs, {-0.25f, 0.25f, -4.f, 1.f}, true, {.gamma = 0.5}},
        {"negative reads as 0 from the table", signs, {0.f, 0.25f, 0.f, 1.f}, false, {.gamma = 0.5}},
        {"clip white", c, {1.f, 0.5f, -1.f, 1.f}, true, {.gain = 2.0, .clipWhite = true}},
        {"no clip: float has no ceiling", c, {2.f, 0.5f, -1.f, 1.f}, true, {.gain = 2.0}},
        {"clip black", c, {2.f, 0.5f, 0.f, 1.f}, true, {.gain = 2.0, .clipBlack = true}},
    };
    for (const Edge &e : edges) {
        AppSwitches switches(e.fastPower, true);
        Ref<Image> flat = NewImageTagList({{ImgWidth, 5}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt32}});
        flat->Fill(e.in);
        Rig rig(flat);
        Apply(rig.bc, e.s);
        Ref<Image> out = Render(rig.bc);
        ASSERT_TRUE(out) << e.name;
        const Px got = ToPx(out->GetFlt(2, 1)), want = ToPx(e.expected);
        for (int c = 0; c < 4; ++c)
            EXPECT_NEAR(got[c], want[c], 2e-6 * (1 + std::fabs(want[c]))) << e.name << " channel " << c;
    }
}

TEST_F(BrightnessContrast, DefaultsAndHardLimits) {
    OrvaneDoc doc;
    Operator *bc = doc.AddTool(OvID("BrightnessContrast"));
    ASSERT_NE(bc, nullptr);
    for (const auto &[id, value] : Values(Settings{}))
        EXPECT_EQ(dynamic_cast<const Number &>(*bc->FindInput(id)->Default()).value, value) << id;
    // Typed values below the hard limits are raised; there is no upper one.
    auto value = [&](const char *id) { return dynamic_cast<const Number &>(*bc->FindInput(id)->Constant()).value; };
    for (const auto &[id, low] : {std::pair{"Gamma", 0.0}, {"Contrast", -1.0}, {"Saturation", 0.0}}) {
        Orvane::Test::SetNumber(bc, id, low - 3);
        EXPECT_EQ(value(id), low) << id;
    }
    Orvane::Test::SetNumber(bc, "Gain", 7.5);
    EXPECT_EQ(value("Gain"), 7.5);
}

TEST_F(BrightnessContrast, NothingToDoPassesTheSameImageAndPreCalculationMakesNoPixels) {
    const Settings noChannel{.gain = 2.0, .gamma = 2.0, .red = false, .green = false, .blue = false};
    const Settings alphaGain{.gain = 2.0, .red = false, .green = false, .blue = false, .alpha = true};
    // Name, depth, whether the input is handed on, settings.
    const std::tuple<const char *, int, bool, Settings> cases[] = {
        {"defaults, float", DepthRGBAFlt32, true, {}},
        {"defaults, 16-bit", DepthRGBAInt16, true, {}},
        {"defaults, mask", DepthAFlt32, true, {}},
        {"no channel chosen", DepthRGBAFlt32, true, noChannel},
        {"gain within eps of 1", DepthRGBAFlt32, true, {.gain = 1.0 + 5e-8}},
        {"clip on integer", DepthRGBAInt16, true, {.clipBlack = true, .clipWhite = true}},
        {"clip on float", DepthRGBAFlt32, false, {.clipWhite = true}},
        {"brightness under one 16-bit step", DepthRGBAInt8, true, {.bright = 1e-6}},
        {"the same brightness on float", DepthRGBAFlt16, false, {.bright = 1e-6}},
        {"low under one 16-bit step", DepthRGBAInt16, true, {.low = 1e-5}},
        {"the same low on float", DepthRGBAFlt32, false, {.low = 1e-5}},
        {"high a hair below 1 cuts to 65534", DepthRGBAInt16, false, {.high = 1.0 - 1e-6}},
        {"reverse defaults", DepthRGBAFlt32, true, {.reverse = true}},
        {"pre-divide alone", DepthRGBAInt16, false, {.prePost = true}},
        {"alpha only, gain", DepthRGBAFlt32, false, alphaGain},
        {"matrix route", DepthRGBAFlt32, false, {.gain = 1.2, .bright = 0.1}},
        {"row route", DepthRGBAFlt32, false, {.gamma = 1.3, .prePost = true}},
    };
    const ImgRectI outside(100, 100, 120, 110); // beyond the frame and the data
    for (const auto &[name, depth, passes, settings] : cases) {
        SCOPED_TRACE(name);
        Ref<Image> src = Orvane::Test::PatternImage(8, 4, depth);
        Rig rig(src);
        Apply(rig.bc, settings);
        Ref<Image> shape = Render(rig.bc, nullptr, ReqFlagPreCalc);
        ASSERT_TRUE(shape && shape->IsNoData() && !shape->HasScanLineData());
        EXPECT_EQ(shape->DataWindow(), ImgRectI(0, 0, 8, 4));
        EXPECT_EQ(shape->Depth(), depth);
        EXPECT_EQ(rig.source->processCount, 0) << "pre-calculation asked the source for pixels";
        Ref<Image> out = Render(rig.bc), none = Render(rig.bc, &outside);
        ASSERT_TRUE(out && none);
        EXPECT_EQ(out.Get() == src.Get(), passes);
        EXPECT_TRUE(passes || (none->DataWindow().IsNull() && none->ValidWindow().IsNull()));
    }
}

/// Expects `a` to hold `b`'s bytes over `r`.
void ExpectSameBits(const Image &a, const Image &b, const ImgRectI &r) {
    for (int y = r.y0; y < r.y1; ++y)
        ASSERT_EQ(std::memcmp(a.PixelAddress(r.x0, y), b.PixelAddress(r.x0, y), size_t(r.Width()) * a.BytesPerPixel()),
                  0)
            << "row " << y;
}

TEST_F(BrightnessContrast, CanvasBeyondTheDataWindowAndRegionsUnderEachClippingMode) {
    const ImgRectI inWindow(8, 4, 40, 28);
    const FltPixel canvas{0.2f, 0.4f, 0.6f, 0.8f};
    // Settings, and whether they take the rows rather than one matrix.
    const std::pair<Settings, bool> routes[] = {{{.gain = 1.2, .bright = 0.1, .sat = 0.7, .alpha = true}, false},
                                                {{.gain = 1.2, .gamma = 1.5, .sat = 0.7, .alpha = true}, true},
                                                {{.gain = 1.2, .gamma = 1.5, .reverse = true}, true}};
    // Mode, the output's window, whether the output keeps the input's canvas.
    const std::tuple<const char *, ImgRectI, bool> clips[] = {{"ClippingMode_None", inWindow, false},
                                                              {"ClippingMode_Domain", inWindow, true},
                                                              {"ClippingMode_Frame", ImgRectI(0, 0, 48, 32), true}};
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16})
        for (const auto &[settings, rows] : routes)
            for (const auto &[mode, window, keepsInputCanvas] : clips) {
                SCOPED_TRACE(std::string(mode) + (rows ? " rows" : " matrix") + (settings.reverse ? " reverse" : "") +
                             ", depth " + std::to_string(depth));
                Ref<Image> src = Orvane::Test::WindowedImage(48, 32, inWindow, canvas, 3, depth);
                Rig rig(src);
                Apply(rig.bc, settings);
                Orvane::Test::SetID(rig.bc, "ClippingMode", mode);
                const Model model(settings);
                // Integer rows take the 16-bit steps, which clamp between steps; the rest follows the float steps.
                const bool integer = depth == DepthRGBAInt16;
                auto expectedOf = [&, rows = rows](const Px &in) {
                    Px out = model.Float(in);
                    if (!integer) return out;
                    std::array<int64_t, 4> p;
                    for (int c = 0; c < 4; ++c) p[c] = static_cast<int64_t>(in[c] * 65535.0 + 0.5);
                    const auto r = model.Int(p);
                    for (int c = 0; c < 4; ++c) out[c] = rows ? r[c] / 65535.0 : std::clamp(out[c], 0.0, 1.0);
                    return out;
                };
                // Stored pixels clamp on integer; the matrix's canvas colour does not.
                const Px storedCanvas = expectedOf(ToPx(src->GetCanvasColor()));
                const Px processedCanvas = integer && !rows ? model.Float(ToPx(src->GetCanvasColor())) : storedCanvas;
                const double tol = depth == DepthRGBAFlt32 ? 1e-5 : integer ? 4.0 / 65535 : 1e-3;
                for (uint32_t flags : {0u, ReqFlagPreCalc}) {
                    Ref<Image> out = Render(rig.bc, nullptr, flags);
                    ASSERT_TRUE(out && out->DataWindow() == window);
                    EXPECT_EQ(out->IsNoData(), flags != 0);
                    const Px outCanvas = ToPx(out->GetCanvasColor());
                    for (int c = 0; c < 4; ++c)
                        EXPECT_NEAR(outCanvas[c], keepsInputCanvas ? ToPx(canvas)[c] : processedCanvas[c],
                                    keepsInputCanvas ? 0.0 : tol);
                    if (flags) continue;
                    // Beyond the input's window the processed canvas; inside, the processed pixels.
                    for (int y = window.y0; y < window.y1; ++y)
                        for (int x = window.x0; x < window.x1; ++x) {
                            const Px got = ToPx(out->GetFlt(x, y)), want = inWindow.Contains(x, y)
                                                                               ? expectedOf(ToPx(src->GetFlt(x, y)))
                                                                               : storedCanvas;
                            for (int c = 0; c < 4; ++c)
                                ASSERT_NEAR(got[c], want[c], integer ? tol : tol * (1 + std::fabs(want[c])))
                                    << x << "," << y << " ch " << c;
                        }
                    // A region of interest is the crop of the full render, beyond the data and the frame too.
                    for (const ImgRectI &roi :
                         {ImgRectI(5, 7, 30, 20), ImgRectI(0, 0, 10, 5), ImgRectI(38, 25, 60, 40)}) {
                        Ref<Image> part = Render(rig.bc, &roi);
                        ASSERT_TRUE(part && part->DataWindow() == (window & roi) &&
                                    part->ValidWindow() == (window & roi));
                        EXPECT_EQ(part->GetCanvasColor(), out->GetCanvasColor());
                        ExpectSameBits(*part, *out, window & roi);
                    }
                }
            }
}

TEST_F(BrightnessContrast, SameBitsWithOneWorkerOrManyAndEitherRowFunction) {
    const int before = WorkerCount();
    const Settings settings[] = {{.gain = 1.2, .bright = 0.1, .sat = 0.8},
                                 {.gain = 1.1, .gamma = 1.3, .sat = 0.8, .prePost = true},
                                 {.gamma = 0.7, .low = 0.1, .reverse = true}};
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt8})
        for (const Settings &s : settings) {
            SCOPED_TRACE(depth);
            Rig rig(Orvane::Test::PatternImage(300, 270, depth, 5));
            Apply(rig.bc, s);
            AppSwitches vector(true, true);
            SetWorkerCount(1);
            Ref<Image> one = Render(rig.bc);
            SetWorkerCount(std::max(2, before));
            Ref<Image> many = Render(rig.bc);
            SetWorkerCount(before);
            ASSERT_TRUE(one && many && one.Get() != many.Get());
            ExpectSameBits(*one, *many, one->DataWindow());
            if (depth == DepthRGBAInt8) continue;
            // The vector rows and the general ones give the same bits.
            AppSwitches general(true, false);
            Ref<Image> generalRows = Render(rig.bc);
            ASSERT_TRUE(generalRows && generalRows.Get() != many.Get());
            ExpectSameBits(*generalRows, *many, many->DataWindow());
        }
    EXPECT_EQ(WorkerCount(), before);
}

// ---- on the device ----

/// A source whose data window is offset from the frame on every side.
Ref<Image> OddSource(int depth) {
    const ImgRectI dw(-3, 5, 50, 38);
    Ref<Image> img = Test::PatternImage(64, 40, depth, 5)->CopyOfImageTagList({{ImgDataWindow, &dw}});
    img->SetCanvasColor(FltPixel{0.2f, -0.1f, 0.6f, 0.5f});
    return img;
}

/// Largest difference over the data window and the canvas, relative to the
/// value's size above 1.
double MaxDifference(const Image &a, const Image &b) {
    EXPECT_EQ(a.DataWindow(), b.DataWindow());
    double worst = 0;
    auto diff = [&](const FltPixel &p, const FltPixel &q) {
        const Px x = ToPx(p), y = ToPx(q);
        for (int c = 0; c < 4; ++c)
            if (!std::isnan(x[c]) || !std::isnan(y[c]))
                worst = std::max(worst, std::fabs(x[c] - y[c]) / std::max(1.0, std::fabs(y[c])));
    };
    diff(a.GetCanvasColor(), b.GetCanvasColor());
    const ImgRectI dw = a.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) diff(a.GetFlt(x, y), b.GetFlt(x, y));
    return worst;
}

TEST_F(BrightnessContrastDevice, MatchesTheRowsOverControlsDirectionsAndDepths) {
    ORVANE_NEED_OPENCL(ctx);
    const std::pair<const char *, Settings> cases[] = {
        {"gain, lift, gamma", {.gain = 1.3, .lift = 0.05, .gamma = 0.7}},
        {"contrast, brightness, saturation, clips",
         {.contrast = 0.4, .bright = -0.1, .sat = 1.6, .clipBlack = true, .clipWhite = true}},
        {"pre-divide, low/high", {.gain = 0.8, .low = 0.1, .high = 0.9, .prePost = true}},
        {"pre-divide, clip white, low",
         {.gain = 1.3, .contrast = 0.2, .sat = 0.6, .low = 0.05, .clipWhite = true, .prePost = true}},
        {"alpha only, high equals low",
         {.gamma = 1.8, .sat = 0.3, .low = 0.2, .high = 0.2, .red = false, .alpha = true}},
        {"gain equals lift, contrast -1, gamma 0", {.gain = 2, .lift = 2, .gamma = 0, .contrast = -1}},
        {"gamma 2.2, no saturation", {.gamma = 2.2, .sat = 0}},
        {"linear chain (one matrix)", {.gain = 1.2, .bright = 0.1, .sat = 1.4, .alpha = true}},
    };
    // Float results agree to float rounding of the power (the device's powf
    // against the host's); integers to one 16-bit step through the gamma
    // table and the fixed point contrast, four for 8 bits.
    const std::map<int, double> tolerance = {{DepthRGBAFlt32, 2e-5},        {DepthRGBAFlt16, 1e-3},
                                             {DepthRGBAInt16, 3.1 / 65535}, {DepthRGBAInt8, 1.01 / 255},
                                             {DepthAFlt32, 2e-5},           {DepthAInt16, 3.1 / 65535}};
    const ImgRectI roi(12, 2, 61, 33);
    for (const auto &[name, settings] : cases)
        for (bool reverse : {false, true})
            for (const auto &[depth, tol] : tolerance) {
                SCOPED_TRACE(std::string(name) + (reverse ? " reverse" : " forward") + " depth " +
                             std::to_string(depth));
                Rig rig(OddSource(depth));
                Settings s = settings;
                s.reverse = reverse;
                Apply(rig.bc, s);
                Ref<Image> cpu = Render(rig.bc, &roi);
                const int launches = ctx->LaunchCount();
                RenderTask task;
                Ref<Image> dev = Render(rig.bc, &roi, 0, ctx, &task);
                ASSERT_TRUE(cpu && dev);
                EXPECT_GT(ctx->LaunchCount(), launches) << "the device ran";
                EXPECT_TRUE(task.DeviceLog().empty()) << task.DeviceLog().front();
                // Without a gamma the float results are the rows' bits.
                EXPECT_LE(MaxDifference(*dev, *cpu), depth == DepthRGBAFlt32 && s.gamma == 1.0 ? 0.0 : tol);
            }
}

TEST_F(BrightnessContrastDevice, AChainStaysOnTheDeviceAndResultsStayStaleUntilDownloaded) {
    ORVANE_NEED_OPENCL(ctx);
    Ref<Image> src = OddSource(DepthRGBAFlt32);
    Rig rig(src);
    Operator *second = rig.AddAfter(rig.bc);
    Apply(rig.bc, {.gamma = 1.5});
    Apply(second, {.gamma = 1.5, .reverse = true});
    const int launches = ctx->LaunchCount();
    Ref<Image> shape = Render(rig.bc, nullptr, ReqFlagPreCalc, ctx);
    ASSERT_TRUE(shape && shape->IsNoData() && !shape->GetGPUMem() && !src->GetGPUMem());
    EXPECT_EQ(ctx->LaunchCount(), launches) << "a pre-calculation reached the device";
    RenderTask task;
    task.SetDevice(ctx);
    EvalOptions opt;
    opt.task = &task;
    Ref<Parameter> middle = EvaluateOnDevice(rig.bc->FindMainOutput(), 0.0, opt); // cached for the next request
    auto *mid = dynamic_cast<Image *>(middle.Get());
    ASSERT_TRUE(mid);
    EXPECT_EQ(ctx->LaunchCount(), launches + 1);
    // The input was uploaded and keeps its pixels; the result lives on the device only.
    ASSERT_TRUE(src->GetGPUMem() && !src->IsGPUMemDirty() && mid->IsGPUMemDirty());
    const Ref<Parameter> last = Evaluate(second->FindMainOutput(), 0.0, opt);
    // The second tool read the first one's image on the device: it never came back. Forward then reverse: the input.
    ASSERT_TRUE(last && !mid->HasScanLineData());
    EXPECT_LE(MaxDifference(*dynamic_cast<Image *>(last.Get()), *src), 1e-4);
    ASSERT_TRUE(mid->DownloadGPUMem());
    EXPECT_LE(MaxDifference(*mid, *Render(rig.bc)), 2e-5);
}

/// A device that takes data but refuses to compile anything.
class RefusingDevice final : public IDeviceContext {
    struct Memory final : IDeviceMemory {
        Memory(IDeviceContext *c, size_t n) : IDeviceMemory(c, n) {}
    };

public:
    DeviceBackend Backend() const override { return DeviceBackend::OpenCL; }
    std::string DeviceName() const override { return "refusing"; }
    std::string DriverKey() const override { return "refusing"; }
    std::shared_ptr<IDeviceMemory> Allocate(size_t n, std::string *) override {
        return std::make_shared<Memory>(this, n);
    }
    bool Write(IDeviceMemory &, size_t, const void *, size_t, std::string *) override { return true; }
    bool Read(const IDeviceMemory &, size_t, void *, size_t, std::string *) override { return false; }

protected:
    std::shared_ptr<IDeviceKernel> Build(const std::string &, const std::string &, std::vector<KernelParamDecl>,
                                         std::string *log) override {
        *log = "refused";
        return nullptr;
    }
    bool DoLaunch(const IDeviceKernel &, const std::vector<KernelArgument> &, int, int, std::string *) override {
        return false;
    }
};

TEST_F(BrightnessContrastDevice, AFailingDeviceGivesTheRowsResult) {
    RefusingDevice refusing;
    for (const Settings &s : {Settings{.gamma = 1.7, .sat = 1.2}, Settings{.gain = 1.5}}) {
        Rig rig(OddSource(DepthRGBAFlt32));
        Apply(rig.bc, s);
        Ref<Image> cpu = Render(rig.bc);
        RenderTask task;
        Ref<Image> fallback = Render(rig.bc, nullptr, 0, &refusing, &task);
        ASSERT_TRUE(cpu && fallback);
        EXPECT_EQ(MaxDifference(*fallback, *cpu), 0.0);
        ASSERT_EQ(task.DeviceLog().size(), 1u);
        EXPECT_NE(task.DeviceLog()[0].find("refused"), std::string::npos) << task.DeviceLog()[0];
    }
}

} // namespace
} // namespace Orvane::bctest
