#pragma once
// Shared by the BrightnessContrast tests: the settings of one tool, a small
// document around it, and an independent per-pixel model of the tool written
// in double precision (float steps) and in whole numbers (16-bit steps).
#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <functional>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/Link.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::bctest {

using Px = std::array<double, 4>;

/// The tool's inputs (defaults as the tool declares them).
struct Settings {
    double gain = 1.0, lift = 0.0, gamma = 1.0, contrast = 0.0, brightness = 0.0, saturation = 1.0;
    double low = 0.0, high = 1.0;
    bool red = true, green = true, blue = true, alpha = false;
    bool reverse = false, clipBlack = false, clipWhite = false, prePost = false;
};

/// The tool's inputs with their values under `s`.
inline std::vector<std::pair<const char *, double>> Values(const Settings &s) {
    return {{"Gain", s.gain},
            {"Lift", s.lift},
            {"Gamma", s.gamma},
            {"Contrast", s.contrast},
            {"Brightness", s.brightness},
            {"Saturation", s.saturation},
            {"Low", s.low},
            {"High", s.high},
            {"Red", s.red},
            {"Green", s.green},
            {"Blue", s.blue},
            {"Alpha", s.alpha},
            {"Direction", s.reverse},
            {"ClipBlack", s.clipBlack},
            {"ClipWhite", s.clipWhite},
            {"PreDividePostMultiply", s.prePost}};
}

inline void Apply(Operator *bc, const Settings &s) { Test::SetNumbers(bc, Values(s)); }

/// Sets the application's power and row switches for a scope.
class AppSwitches {
public:
    AppSwitches(bool fastPower, bool vectorRows)
        : fast_(GetApp()->GetAttrB(AppFastPower)), vector_(GetApp()->GetAttrB(AppVectorRows)) {
        GetApp()->SetAttrsTagList({{AppFastPower, fastPower}, {AppVectorRows, vectorRows}});
    }
    ~AppSwitches() { GetApp()->SetAttrsTagList({{AppFastPower, fast_}, {AppVectorRows, vector_}}); }
    AppSwitches(const AppSwitches &) = delete;
    AppSwitches &operator=(const AppSwitches &) = delete;

private:
    bool fast_, vector_;
};

/// A document with an image source feeding one BrightnessContrast tool.
struct Rig {
    OrvaneDoc doc;
    Test::ImageSourceTool *source = nullptr;
    Operator *bc = nullptr;

    explicit Rig(Ref<Image> img) {
        source = Test::AddImageSource(doc, "Src", std::move(img));
        bc = doc.AddTool(OvID("BrightnessContrast"));
        EXPECT_NE(bc, nullptr);
        if (bc && source) bc->FindInput("Input")->ConnectTo(source->Out());
    }
    /// A second tool fed by the first.
    Operator *AddAfter(Operator *upstream) {
        Operator *next = doc.AddTool(OvID("BrightnessContrast"));
        EXPECT_NE(next, nullptr);
        if (next) next->FindInput("Input")->ConnectTo(upstream->FindMainOutput());
        return next;
    }
};

/// Renders a tool's main output without the result cache (on `device` when
/// given; `onDevice` keeps the result there).
inline Ref<Image> Render(Operator *op, const ImgRectI *roi = nullptr, uint32_t flags = 0,
                         IDeviceContext *device = nullptr, RenderTask *task = nullptr, bool onDevice = false) {
    RenderTask own;
    RenderTask &t = task ? *task : own;
    t.SetDevice(device);
    EvalOptions opt;
    opt.task = &t;
    opt.flags = flags;
    opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    Ref<Parameter> p =
        onDevice ? EvaluateOnDevice(op->FindMainOutput(), 0.0, opt) : Evaluate(op->FindMainOutput(), 0.0, opt);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

/// An image of the frame size with pixels from `fill` over `window` (default:
/// the frame) and the given canvas colour.
inline Ref<Image> MakeImage(int w, int h, int depth, const std::function<FltPixel(int, int)> &fill,
                            const ImgRectI *window = nullptr, FltPixel canvas = {}) {
    const ImgRectI dw = window ? *window : ImgRectI(0, 0, w, h);
    Ref<Image> img = NewImageTagList(
        {{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}, {ImgDataWindow, &dw}, {ImgCanvasColor, &canvas}});
    img->AllocScanLineData();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) img->PutFlt(x, y, fill(x, y));
    return img;
}

inline Px ToPx(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }

/// The stored 16-bit value of channel c at (x, y) (8-bit data widened by 257;
/// a mask gives its one value for every channel).
inline int64_t Stored16(const Image &img, int x, int y, int c) {
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
[[gnu::noinline]] inline double AsFloat(double x) { return static_cast<float>(x); }

/// What the model derives from the settings.
struct Model {
    Settings s;
    bool on[4];
    bool doGamma, doSat, useLowHigh;
    double gain, exponent, finalContrast, finalScale, sat, oneMinusSat;
    double satMat[3][3]; ///< forward: the saturation matrix; reverse: its inverse
    bool truePower = true;

    explicit Model(const Settings &st, bool fastPower = true) : s(st), truePower(fastPower) {
        on[0] = s.red, on[1] = s.green, on[2] = s.blue, on[3] = s.alpha;
        doGamma = std::fabs(s.gamma - 1.0) >= kEps;
        doSat = std::fabs(1.0 - s.saturation) >= kEps;
        useLowHigh = std::fabs(s.low) >= kEps || std::fabs(s.high - 1.0) >= kEps;
        // The tool holds its derived values as 32-bit floats; the model rounds
        // them the same way and does its own arithmetic in double.
        auto f = [](double x) { return AsFloat(x); };
        sat = f(s.saturation), oneMinusSat = f(1.0 - s.saturation);
        const double contrast = f(s.contrast + 1.0);
        const double range = f(s.high - s.low);
        const double inverseRange = range >= kEps ? f(1.0 / range) : 0.0;
        const double oneOverGamma = s.gamma < 1e-5 ? 100000.0 : 1.0 / s.gamma;
        if (!s.reverse) {
            gain = f(s.gain - s.lift);
            exponent = f(oneOverGamma);
            finalContrast = contrast;
            finalScale = inverseRange;
        } else {
            gain = s.gain - s.lift == 0.0 ? 1.0 : f(1.0 / (s.gain - s.lift));
            exponent = f(s.gamma);
            finalContrast = contrast == 0.0 ? 1.0 : f(1.0 / contrast);
            finalScale = range;
        }
        // RGB -> Y Cb Cr, chroma times the saturation, back to RGB.
        const double toYC[3][3] = {
            {0.299, 0.587, 0.114}, {-0.16873589, -0.33126414, 0.5}, {0.5, -0.4186876, -0.08131241}};
        const double toRGB[3][3] = {{1.0, 0.0, 1.402}, {1.0, -0.34413627, -0.71413624}, {1.0, 1.772, 0.0}};
        const double scale[3] = {1.0, s.saturation, s.saturation};
        double m[3][3];
        for (int i = 0; i < 3; ++i)
            for (int j = 0; j < 3; ++j) {
                m[i][j] = 0.0;
                for (int k = 0; k < 3; ++k) m[i][j] += toRGB[i][k] * scale[k] * toYC[k][j];
            }
        for (int i = 0; i < 3; ++i)
            if (!on[i])
                for (int j = 0; j < 3; ++j) m[i][j] = i == j ? 1.0 : 0.0;
        if (!s.reverse) {
            for (int i = 0; i < 3; ++i)
                for (int j = 0; j < 3; ++j) satMat[i][j] = m[i][j];
            return;
        }
        // Inverse by cofactors.
        const double det = m[0][0] * (m[1][1] * m[2][2] - m[1][2] * m[2][1]) -
                           m[0][1] * (m[1][0] * m[2][2] - m[1][2] * m[2][0]) +
                           m[0][2] * (m[1][0] * m[2][1] - m[1][1] * m[2][0]);
        if (std::fabs(det) < kEps) {
            doSat = false;
            for (int i = 0; i < 3; ++i)
                for (int j = 0; j < 3; ++j) satMat[i][j] = i == j ? 1.0 : 0.0;
            return;
        }
        for (int i = 0; i < 3; ++i)
            for (int j = 0; j < 3; ++j) {
                const int r0 = (j + 1) % 3, r1 = (j + 2) % 3, c0 = (i + 1) % 3, c1 = (i + 2) % 3;
                satMat[i][j] = (m[r0][c0] * m[r1][c1] - m[r0][c1] * m[r1][c0]) / det;
            }
    }

    double Power(double x) const {
        if (truePower) return std::copysign(std::pow(std::fabs(x), exponent), x);
        return std::pow(std::max(x, 0.0), exponent); // the table reads negative values as 0
    }

    /// The float steps, one pixel.
    Px Float(Px p) const {
        if (s.prePost) {
            const double k = std::fabs(p[3]) < kEps ? 0.0 : 1.0 / p[3];
            for (int c = 0; c < 3; ++c)
                if (on[c]) p[c] *= k;
        }
        if (!s.reverse) {
            for (int c = 0; c < 4; ++c) {
                if (!on[c]) continue;
                double x = gain * p[c] + s.lift;
                if (doGamma) x = Power(x);
                p[c] = (x - 0.5) * finalContrast + 0.5 + s.brightness;
            }
            if (doSat) {
                const double y = 0.299 * p[0] + 0.587 * p[1] + 0.114 * p[2];
                for (int c = 0; c < 3; ++c)
                    if (on[c]) p[c] = p[c] * sat + y * oneMinusSat;
            }
            if (useLowHigh)
                for (int c = 0; c < 4; ++c)
                    if (on[c]) p[c] = (p[c] - s.low) * finalScale;
        } else {
            if (useLowHigh)
                for (int c = 0; c < 4; ++c)
                    if (on[c]) p[c] = finalScale * p[c] + s.low;
            if (doSat) {
                const Px old = p;
                for (int c = 0; c < 3; ++c)
                    if (on[c]) p[c] = satMat[c][0] * old[0] + satMat[c][1] * old[1] + satMat[c][2] * old[2];
            }
            for (int c = 0; c < 4; ++c) {
                if (!on[c]) continue;
                double x = (p[c] - s.brightness - 0.5) * finalContrast + 0.5;
                if (doGamma) x = Power(x);
                p[c] = (x - s.lift) * gain;
            }
        }
        if (s.prePost)
            for (int c = 0; c < 3; ++c)
                if (on[c]) p[c] *= p[3];
        for (int c = 0; c < 4; ++c) {
            if (on[c] && s.clipBlack && p[c] < 0.0) p[c] = 0.0;
            if (on[c] && s.clipWhite && p[c] > 1.0) p[c] = 1.0;
        }
        return p;
    }

    /// The 16-bit steps, one pixel of values 0..65535.
    std::array<int64_t, 4> Int(std::array<int64_t, 4> p) const {
        auto clamp16 = [](double v) { return static_cast<int64_t>(std::clamp(v, 0.0, 65535.0)); };
        auto round16 = [](double v) { return static_cast<int64_t>(std::floor(std::clamp(v, 0.0, 65535.0) + 0.5)); };
        // Cut from the float values the tool holds.
        const double liftI = std::trunc(AsFloat(s.lift) * 65535.0),
                     brightI = std::trunc(AsFloat(s.brightness) * 65535.0);
        const double lowI = std::trunc(AsFloat(s.low) * 65535.0), highI = std::trunc(AsFloat(s.high) * 65535.0);
        const double contrastI = std::trunc(finalContrast * 16384.0);
        const bool lowHigh = lowI != 0.0 || highI != 65535.0;
        auto table = [&](int64_t x) { return doGamma ? round16(std::pow(x / 65535.0, exponent) * 65535.0) : x; };
        auto contrast = [&](double d) { return std::floor(d * contrastI / 16384.0); };
        if (s.prePost) {
            if (p[3] == 0) {
                for (int c = 0; c < 3; ++c)
                    if (on[c]) p[c] = 0;
                if (!on[3]) return p;
            } else {
                for (int c = 0; c < 3; ++c)
                    if (on[c]) p[c] = std::min<int64_t>(65535, p[c] * 65535 / p[3]);
            }
        }
        if (!s.reverse) {
            for (int c = 0; c < 4; ++c) {
                if (!on[c]) continue;
                const int64_t x = table(clamp16(std::trunc(p[c] * gain) + liftI));
                p[c] = clamp16(contrast(x - 32768.0) + brightI + 32768.0);
            }
            if (doSat) {
                const double y = 0.299 * p[0] + 0.587 * p[1] + 0.114 * p[2];
                for (int c = 0; c < 3; ++c)
                    if (on[c]) p[c] = round16(p[c] * sat + y * oneMinusSat);
            }
            if (lowHigh)
                for (int c = 0; c < 4; ++c)
                    if (on[c]) p[c] = clamp16(std::trunc((p[c] - lowI) * finalScale));
        } else {
            if (lowHigh)
                for (int c = 0; c < 4; ++c)
                    if (on[c]) p[c] = clamp16(std::trunc(finalScale * p[c]) + lowI);
            if (doSat) {
                const auto old = p;
                for (int c = 0; c < 3; ++c)
                    if (on[c]) p[c] = round16(satMat[c][0] * old[0] + satMat[c][1] * old[1] + satMat[c][2] * old[2]);
            }
            for (int c = 0; c < 4; ++c) {
                if (!on[c]) continue;
                const int64_t x = table(clamp16(contrast(p[c] - brightI - 32768.0) + 32768.0));
                p[c] = clamp16(std::trunc((x - liftI) * gain));
            }
        }
        if (s.prePost)
            for (int c = 0; c < 3; ++c)
                if (on[c]) p[c] = static_cast<int64_t>(std::floor(p[c] * p[3] / 65535.0 + 0.5));
        return p;
    }
};

} // namespace Orvane::bctest
