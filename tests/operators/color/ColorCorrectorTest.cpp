// ColorCorrector against a double-precision model written from its documented steps and folding of the controls,
// the pixel function's edge cases, every depth, regions, threads, and the range curves through a saved document.
#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "host/color/ColorCurvesTable.h"
#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Link.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "operators/color/ColorCorrectorRanges.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::cctest {
namespace {
namespace ts = Orvane::Test;
using Px = std::array<double, 4>;
using D3 = std::array<double, 3>;

const double kToLuma[3][3] = {{0.299, 0.587, 0.114}, {-0.16873589, -0.33126414, 0.5}, {0.5, -0.4186876, -0.08131241}};
const double kFromLuma[3][3] = {{1.0, 0.0, 1.402}, {1.0, -0.34413627, -0.71413624}, {1.0, 1.772, 0.0}};

D3 Mul(const double m[3][3], const D3 &v) {
    D3 o;
    for (int i = 0; i < 3; ++i) o[i] = m[i][0] * v[0] + m[i][1] * v[1] + m[i][2] * v[2];
    return o;
}
/// `x` rounded to a 32-bit float. Out of line on purpose: GCC 12 at -O2 may drop the rounding of double -> float ->
/// double round trips that it packs into one vector operation.
[[gnu::noinline]] float AsFloat(double x) { return static_cast<float>(x); }
double Luma(const D3 &c) { return 0.299 * c[0] + 0.587 * c[1] + 0.114 * c[2]; }
double SignedPow(double x, double e) { return x < 0 ? -std::pow(-x, e) : std::pow(x, e); }
double Hue(const D3 &c) {
    const double mx = std::max({c[0], c[1], c[2]}), mn = std::min({c[0], c[1], c[2]});
    if (mx == mn) return 0;
    double h = mx == c[0]   ? (c[1] - c[2]) / (mx - mn)
               : mx == c[1] ? (c[2] - c[0]) / (mx - mn) + 2
                            : (c[0] - c[1]) / (mx - mn) + 4;
    h /= 6;
    return h < 0 ? h + 1 : h;
}

class ColorCorrector : public ::testing::Test {
protected:
    static void SetUpTestSuite() { ts::LoadOperators(); }
};

// ---- the pixel function's edge cases ----

cc::Matrix34 Diagonal(float k) {
    cc::Matrix34 m;
    for (int i = 0; i < 3; ++i) m.m[i][i] = k;
    return m;
}

TEST_F(ColorCorrector, PixelFunctionEdgeCases) {
    cc::Suppression greyTable;
    std::fill(std::begin(greyTable.factor), std::end(greyTable.factor), 1.f);
    greyTable.factor[0] = 0.25f, greyTable.offset = 0.1f;
    // Records: the low matrix doubles, the high one triples; square roots (blue squared); output levels x3; the
    // suppression table above; a lift of 0.1.
    cc::RangeRecord matrices, roots, levels2, grey, lift;
    matrices.doMatrix = true, matrices.low = Diagonal(2.f), matrices.high = Diagonal(3.f);
    roots.doGamma = true, roots.gamma[0] = roots.gamma[1] = 0.5f, roots.gamma[2] = 2.f;
    levels2.doLevels2 = true, std::fill(levels2.mul2, levels2.mul2 + 3, 3.f);
    grey.suppression = &greyTable;
    lift.doLevels1 = true, std::fill(lift.add1, lift.add1 + 3, 0.1f);
    const float kPixel = std::nanf(""); // L from the pixel: the whole pixel function, not one range function
    enum How : unsigned { Fast = 1, Full = 2, GammaFirst = 4, Pre = 8, Post = 16 }; // else Better, gamma after levels
    struct Edge {
        const char *name;
        const cc::RangeRecord *r;
        unsigned how;
        float L;
        Px in, want;
    };
    const Px mid{.5, .5, .5, 1}, dark{-.2, -.1, -.3, 1}, bright{1.5, 1.3, 1.2, 1}, px{.2, .4, .6, 1};
    const cc::RangeRecord neutral;
    const Edge edges[] = {
        {"neutral: the pixel as it came", &neutral, 0, 0.3f, {0.2, -5, 7, 0.4}, {0.2, -5, 7, 0.4}},
        {"L exactly 0.5 takes the high matrix", &matrices, 0, 0.5f, mid, {1.5, 1.5, 1.5, 1}},
        {"just below 0.5 the low one", &matrices, 0, std::nextafter(0.5f, 0.f), mid, {1, 1, 1, 1}},
        {"Fast, below black: the low matrix", &matrices, Fast, -0.16f, dark, {-0.4, -0.2, -0.6, 1}},
        {"Fast, above white: the high matrix", &matrices, Fast, 1.35f, bright, {4.5, 3.9, 3.6, 1}},
        // The below-black and above-white matrices here are identities: the detour changes nothing.
        {"Better, below black: the luma-first detour", &matrices, 0, -0.16f, dark, dark},
        {"Full, above white: the luma-first detour", &matrices, Full, 1.35f, bright, bright},
        {"negative values keep their sign under gamma", &roots, 0, 0.f, {-.25, .25, -2, 1}, {-.5, .5, -4, 1}},
        {"gamma before levels: levels 2 does not run", &levels2, GammaFirst, 0.f, px, px},
        {"gamma after levels: levels 2 runs", &levels2, 0, 0.f, px, {.6, 1.2, 1.8, 1}},
        // Grey has hue 0: entry 0 (0.25) pulls it towards luma + offset.
        {"grey takes the first suppression entry", &grey, 0, 0.f, {.3, .3, .3, 1}, {.375, .375, .375, 1}},
        {"cyan reads another entry", &grey, 0, 0.f, {.1, .5, .5, 1}, {.1, .5, .5, 1}},
        {"alpha 0 with pre-divide: black first", &lift, Pre, kPixel, {.2, .4, .6, 0}, {.1, .1, .1, 0}},
        {"pre-divide by alpha", &lift, Pre, kPixel, {.2, .4, .1, .5}, {.5, .9, .3, .5}},
        {"divided, lifted, multiplied back", &lift, Pre | Post, kPixel, {.2, .4, .1, .5}, {.25, .45, .15, .5}},
        {"post-multiply: alpha 5e-7 gives black", &lift, Post, kPixel, {.2, .4, .6, 5e-7}, {0, 0, 0, 5e-7}},
        {"post-multiply: alpha -9e-7 too", &lift, Post, kPixel, {.2, .4, .6, -9e-7}, {0, 0, 0, -9e-7}},
        {"post-multiply: alpha 2e-6 multiplies", &lift, Post, kPixel, {.2, .4, .6, 2e-6}, {6e-7, 1e-6, 1.4e-6, 2e-6}},
    };
    for (const Edge &e : edges) {
        cc::PixelSettings s;
        for (int i = 0; i < 3; ++i)
            for (int j = 0; j < 3; ++j) {
                s.toLumaFirst.m[i][j] = static_cast<float>(kToLuma[i][j]);
                s.fromLumaFirst.m[i][j] = static_cast<float>(kFromLuma[i][j]);
            }
        s.tintMode = e.how & Fast ? cc::TintFast : e.how & Full ? cc::TintFull : cc::TintBetter;
        s.gammaAfterLevels = !(e.how & GammaFirst), s.preDivide = e.how & Pre, s.postMultiply = e.how & Post;
        s.records[0] = *e.r;
        float p[4] = {AsFloat(e.in[0]), AsFloat(e.in[1]), AsFloat(e.in[2]), AsFloat(e.in[3])}, out[4];
        std::copy(p, p + 4, out);
        if (std::isnan(e.L))
            cc::CorrectPixel(s, out);
        else
            cc::RangeFunction(s, *e.r, e.L, p, out);
        for (int c = 0; c < 4; ++c)
            EXPECT_NEAR(out[c], e.want[c], 1e-7 + 1e-6 * std::fabs(e.want[c])) << e.name << ", channel " << c;
        if (e.r == &neutral) {
            EXPECT_EQ(std::memcmp(p, out, sizeof p), 0) << "bit for bit";
        }
    }
    // With ranges the three range functions are weighted by the curves and summed, alpha included.
    const ColorCurvesTable curves;
    cc::PixelSettings s;
    s.rangesInUse = true, s.curves = &curves;
    const float adds[3] = {0.3f, 0.f, -0.2f};
    for (int k = 0; k < 3; ++k)
        s.records[k].doLevels1 = true, std::fill(s.records[k].add1, s.records[k].add1 + 3, adds[k]);
    for (float v : {0.f, 0.1f, 0.25f, 0.5f, 0.8f, 1.2f}) {
        float p[4] = {v, v, v, 0.6f}, ws, wm, wh;
        curves.WeightsAt(cc::LumaOf(p), ws, wm, wh);
        cc::CorrectPixel(s, p);
        EXPECT_NEAR(p[0], v + ws * 0.3 - wh * 0.2, 1e-6) << v;
        EXPECT_NEAR(p[3], 0.6, 1e-6) << v;
    }
}

TEST_F(ColorCorrector, BlocksGiveTheWeightedSumOfTheThreeRangeFunctions) {
    // A block of dark pixels has highlight weight 0 throughout, and may skip that range, but only where that
    // changes nothing: a highlights gain that overflows (the fourth pixel, R * 1e36) must still make 0 * inf = NaN.
    const ColorCurvesTable curves;
    for (float highGain : {2.f, 1e36f}) {
        cc::PixelSettings s;
        s.rangesInUse = true, s.curves = &curves;
        for (int r = 0; r < 3; ++r) {
            cc::RangeRecord &rec = s.records[r];
            rec.doLevels1 = true, std::fill(rec.mul1, rec.mul1 + 3, r == 2 ? highGain : 1.5f);
            cc::SetFiniteWithin(s, rec);
        }
        float block[6][4] = {{.1f, .2f, .1f, 1}, {0, 0, 0, 1},      {.3f, .1f, .2f, .5f},
                             {1000, -510, 0, 1}, {-.2f, .1f, 0, 1}, {.4f, .3f, .2f, 1}};
        float want[6][4];
        for (int k = 0; k < 6; ++k) {
            const float L = cc::LumaOf(block[k]);
            float w[3], sum[4] = {};
            curves.WeightsAt(L, w[0], w[1], w[2]);
            ASSERT_EQ(w[2], 0.f) << "a dark pixel";
            for (int r = 0; r < 3; ++r) {
                float part[4];
                cc::RangeFunction(s, s.records[r], L, block[k], part);
                for (int c = 0; c < 4; ++c) sum[c] += w[r] * part[c];
            }
            std::copy(sum, sum + 4, want[k]);
        }
        cc::CorrectBlock(s, block, block, 6);
        for (int k = 0; k < 6; ++k)
            for (int c = 0; c < 4; ++c)
                EXPECT_TRUE(std::memcmp(&block[k][c], &want[k][c], 4) == 0 ||
                            (std::isnan(block[k][c]) && std::isnan(want[k][c])))
                    << "gain " << highGain << ", pixel " << k << ", channel " << c << ": " << block[k][c] << " against "
                    << want[k][c];
        EXPECT_EQ(std::isnan(block[3][0]), highGain > 1e30f) << "the overflowing range still counts";
    }
}

// ---- the whole tool against a model of its controls ----

/// Control values by ID; the rest keep their defaults.
using Controls = std::map<std::string, double>;

const char *const kRangeIds[] = {"Master", "Shadows", "MidTones", "Highlights"};
const char *const kChannels[] = {"RGB", "Red", "Green", "Blue"};

/// The tool's documented folding and pixel steps, in double, from the control values.
struct ToolModel {
    Controls v;
    const Operator *tool; ///< gives the defaults of the controls not in v
    double Default(const std::string &id) const {
        return dynamic_cast<const Number &>(*tool->FindInput(id.c_str())->Default()).value;
    }
    double Get(const std::string &id) const {
        auto it = v.find(id);
        return it == v.end() ? Default(id) : it->second;
    }
    bool RangesInUse() const {
        for (const auto &[id, value] : v)
            if (value != Default(id) && (id.rfind("Shadows", 0) == 0 || id.rfind("MidTones", 0) == 0 ||
                                         id.rfind("Highlights", 0) == 0 || (id.back() >= '1' && id.back() <= '3')))
                return true;
        return false;
    }
    /// One attribute of channel i (0..2) in range r, Master's and the range's RGB and channel values combined.
    double Attr(int r, int i, const char *word, bool multiplies, double neutral) const {
        double x = multiplies ? 1 : neutral;
        for (int range : {0, r})
            for (int ch : {0, i + 1}) {
                const double part = Get(std::string(kRangeIds[range]) + kChannels[ch] + word);
                x = multiplies ? x * part : x + part - neutral;
            }
        return x;
    }
    /// The chroma step of range `r` (tint weight w).
    void Chroma(int r, double w, double &cb, double &cr) const {
        const std::string n = std::to_string(r);
        const double hue = (Get("WheelHue" + n) + Get("Hue" + n)) * M_PI / 180;
        const double sat = Get("WheelSaturation" + n) * Get("Saturation" + n);
        const double ta = Get("WheelTintAngle" + n) * M_PI / 180, tl = Get("WheelTintLength" + n);
        double tb = tl * std::cos(ta) * w, tr = tl * std::sin(ta) * w;
        const bool full = std::lround(Get("TintMode")) == 1;
        if (full) cb += tb, cr += tr;
        const double b = sat * (std::cos(hue) * cb - std::sin(hue) * cr),
                     c = sat * (std::sin(hue) * cb + std::cos(hue) * cr);
        cb = b, cr = c;
        if (!full) cb += tb, cr += tr;
    }
    double Suppression(int r, double u) const {
        const char *words[] = {"Red", "Yellow", "Green", "Cyan", "Blue", "Magenta"};
        double x = u - Get("SuppressionAngle" + std::to_string(r)) / 360;
        x -= std::floor(x);
        const int k = std::min(static_cast<int>(x * 6), 5);
        const double f = x * 6 - k;
        return Get(words[k] + std::to_string(r)) * (1 - f) + Get(words[(k + 1) % 6] + std::to_string(r)) * f;
    }
    /// Record k's function of a (pre-divided) pixel with luminance L.
    Px Range(int k, double L, const Px &p, bool &edge) const {
        const int r = k + 1;
        D3 y = Mul(kToLuma, {p[0], p[1], p[2]});
        const int mode = static_cast<int>(std::lround(Get("TintMode")));
        const bool inside = mode == 0 || (L >= 0 && L <= 1);
        const double ty = inside ? L : 0.0; // outside, the clamped luma weighs the tint: 0 at black and white
        const double w = inside ? (L < 0.5 ? 2 * ty : 2 - 2 * ty) : 0.0;
        Chroma(0, w, y[1], y[2]);
        Chroma(r, w, y[1], y[2]);
        // Without a colour change the pixel skips the colour step (the round trip is not exact in any arithmetic).
        bool colour = false;
        for (const char *w : {"WheelHue", "WheelSaturation", "WheelTintLength", "Hue", "Saturation"})
            for (int range : {0, r})
                colour = colour || Get(w + std::to_string(range)) != Default(w + std::to_string(range));
        D3 c = colour ? Mul(kFromLuma, y) : D3{p[0], p[1], p[2]};
        const bool after = std::lround(Get("ProcessOrder")) == 1;
        for (int i = 0; i < 3; ++i) {
            const double low = Attr(r, i, "Low", false, 0), high = Attr(r, i, "High", false, 1);
            const double gain = Attr(r, i, "Gain", true, 1), lift = Attr(r, i, "Lift", false, 0);
            const double contrast = Attr(r, i, "Contrast", true, 1), bright = Attr(r, i, "Brightness", false, 0);
            const double power = Attr(r, i, "Gamma", true, 1) * Attr(r, i, "Mid", true, 1);
            const double e = power < 1e-5 ? 1e5 : 1 / power;
            const double outLow = Attr(r, i, "OutputLow", false, 0), outHigh = Attr(r, i, "OutputHigh", false, 1);
            auto affine = [&](double x) {
                x = (x - low) / (high - low);
                x = x * (gain - lift) + lift;
                return (x - 0.5) * contrast + 0.5 + bright;
            };
            double x = c[i];
            if (after)
                x = SignedPow(affine(x), e) * (outHigh - outLow) + outLow;
            else
                x = affine(SignedPow(x, e)) * (outHigh - outLow) + outLow;
            c[i] = x;
        }
        const int n = cc::Suppression::kSamples;
        auto factorAt = [&](int bin) {
            const double u = (bin + 0.5) / n;
            return Suppression(0, u) * Suppression(r, u);
        };
        const int bin = std::clamp(static_cast<int>(n * Hue(c)), 0, n - 1);
        const float cf[3] = {AsFloat(c[0]), AsFloat(c[1]), AsFloat(c[2])};
        const double f = factorAt(bin);
        edge = edge || f != factorAt(std::clamp(static_cast<int>(n * cc::HueOf(cf[0], cf[1], cf[2])), 0, n - 1));
        if (std::fabs(f - 1) > 1e-6) {
            const double d = Luma(c) * (1 - f);
            for (double &x : c) x = x * f + d;
        }
        return {c[0], c[1], c[2], p[3]};
    }
    /// The tool's result for one pixel; `edge` is set where float and double arithmetic fall on two sides of a
    /// threshold (a range sample, the 0.5 split, a hue bin) and so may rightly choose differently.
    Px Pixel(Px p, bool &edge) const {
        const bool prePost = Get("PreDividePostMultiply") >= 0.5;
        if (prePost)
            for (int c = 0; c < 3; ++c) p[c] = p[3] == 0 ? 0 : p[c] / p[3];
        const double L = Luma({p[0], p[1], p[2]});
        // Thresholds read in float: the 0.5 split and the curves' sample.
        const float Lf = 0.299f * AsFloat(p[0]) + 0.587f * AsFloat(p[1]) + 0.114f * AsFloat(p[2]);
        const double sample = std::clamp(L, 0.0, 1.0) * 1023;
        edge = (L < 0.5) != (Lf < 0.5f) ||
               static_cast<int>(sample + 0.5) != static_cast<int>(std::clamp(Lf, 0.f, 1.f) * 1023 + 0.5f);
        Px out{};
        if (!RangesInUse()) {
            out = Range(0, L, p, edge);
        } else {
            const double x = std::floor(sample + 0.5) / 1023; // the curves' nearest sample (Simple preset)
            const double w[3] = {std::max(0.0, 1 - 2 * x), 0, std::max(0.0, 2 * x - 1)};
            const double ws[3] = {w[0], 1 - w[0] - w[2], w[2]};
            for (int k = 0; k < 3; ++k) {
                const Px part = Range(k, L, p, edge);
                for (int c = 0; c < 4; ++c) out[c] += ws[k] * part[c];
            }
        }
        if (prePost) {
            const double a = std::fabs(out[3]) < 1e-6 ? 0 : out[3];
            for (int c = 0; c < 3; ++c) out[c] *= a;
        }
        return out;
    }
};

/// A document with an image source feeding a ColorCorrector.
struct Rig {
    OrvaneDoc doc;
    ts::ImageSourceTool *source;
    Operator *cc;
    explicit Rig(Ref<Image> img)
        : source(ts::AddImageSource(doc, "Src", std::move(img))), cc(doc.AddTool(OvID("ColorCorrector"))) {
        EXPECT_TRUE(cc && cc->FindInput("Input")->ConnectTo(source->Out()));
    }
    void Set(const Controls &v) {
        for (const auto &[id, value] : v) ts::SetNumber(cc, id.c_str(), value);
    }
};

Ref<Image> Render(Operator *op, const ImgRectI *roi = nullptr, uint32_t flags = 0) {
    EvalOptions opt;
    opt.flags = flags, opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    return ts::EvalImage(op, 0.0, opt);
}

Px ToPx(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }

/// Controls from "ID=value ID=value ...".
Controls Parse(const std::string &text) {
    Controls c;
    for (size_t at = 0, eq; (eq = text.find('=', at)) != std::string::npos;) {
        const size_t end = std::min(text.find(' ', eq), text.size());
        c[text.substr(at, eq - at)] = std::stod(text.substr(eq + 1, end - eq - 1));
        at = end + 1;
    }
    return c;
}

const std::pair<const char *, const char *> kSettings[] = {
    {"master gain and lift", "MasterRGBGain=1.4 MasterRGBLift=0.05"},
    {"master per channel, gamma after levels",
     "MasterRedGain=0.8 MasterBlueGamma=1.6 MasterRGBContrast=1.3 MasterGreenBrightness=-0.05 ProcessOrder=1"},
    {"levels, gamma before levels",
     "MasterRGBLow=0.1 MasterRGBHigh=0.9 MasterRGBMid=1.4 MasterRedOutputLow=0.05 MasterRGBOutputHigh=0.8"},
    {"levels, gamma after levels", "MasterRGBLow=0.1 MasterRGBHigh=0.9 MasterRGBMid=1.4 MasterRedOutputLow=0.05 "
                                   "MasterRGBOutputHigh=0.8 ProcessOrder=1"},
    {"hue, saturation and tint, Better", "WheelHue0=30 WheelSaturation0=0.7 WheelTintAngle0=200 WheelTintLength0=0.1"},
    {"tint, Full", "WheelTintAngle0=100 WheelTintLength0=0.15 Saturation0=1.3 TintMode=1"},
    {"tint, Fast", "WheelTintAngle0=100 WheelTintLength0=0.15 Hue0=-20 TintMode=0"},
    {"suppression", "Red0=0.2 Cyan0=0.6 SuppressionAngle0=15"},
    {"ranges with master", "MasterRGBGain=1.1 ShadowsRGBLift=0.08 MidTonesGreenGamma=1.3 HighlightsRGBGain=0.8 "
                           "WheelTintLength1=0.1 WheelTintAngle1=250 Blue3=0.3 ProcessOrder=1"},
    {"pre-divide with everything", "PreDividePostMultiply=1 MasterRGBGamma=0.8 WheelHue2=40 Magenta0=0.5 "
                                   "HighlightsRedOutputHigh=0.9 ProcessOrder=1"},
};

TEST_F(ColorCorrector, MatchesTheModelOfItsControlsAtEveryDepth) {
    // Depth, and how far a stored value may lie from the model: float rounding through the chain and the
    // rounding of the stored depth.
    const std::pair<int, double> depths[] = {
        {DepthRGBAFlt32, 0.0}, {DepthRGBAFlt16, 1.0 / 1024}, {DepthRGBAInt16, 0.5 / 65535}, {DepthRGBAInt8, 0.5 / 255}};
    for (const auto &[depth, storeTol] : depths) {
        Ref<Image> src = ts::PatternImage(37, 11, depth, 7);
        for (const auto &[name, text] : kSettings) {
            const Controls controls = Parse(text);
            Rig fresh(src);
            fresh.Set(controls);
            const ToolModel model{controls, fresh.cc};
            Ref<Image> out = Render(fresh.cc);
            ASSERT_TRUE(out) << name;
            ASSERT_NE(out.Get(), src.Get()) << name;
            const bool integer = !out->IsFloat();
            int edges = 0;
            const ImgRectI dw = out->DataWindow();
            for (int y = dw.y0; y < dw.y1; ++y)
                for (int x = dw.x0; x < dw.x1; ++x) {
                    bool edge;
                    Px want = model.Pixel(ToPx(src->GetFlt(x, y)), edge);
                    if (edge) {
                        ++edges;
                        continue;
                    }
                    const Px got = ToPx(out->GetFlt(x, y));
                    for (int c = 0; c < 4; ++c) {
                        if (integer) want[c] = std::clamp(want[c], 0.0, 1.0);
                        const double tol =
                            3e-5 * (1 + std::fabs(want[c])) + storeTol * std::max(1.0, std::fabs(want[c]));
                        ASSERT_NEAR(got[c], want[c], tol)
                            << name << ", depth " << depth << " at " << x << "," << y << " channel " << c;
                    }
                }
            EXPECT_LT(edges, 8) << name << ": too many pixels on thresholds to be a fair test";
        }
    }
}

TEST_F(ColorCorrector, NeutralPassesTheInputOnAndPreCalculationMakesNoPixels) {
    const std::tuple<const char *, bool, const char *> cases[] = {
        {"defaults", true, ""},
        {"passive controls", true, "Menu=2 CorrectionRange=3 RangesChannel=1"},
        {"gain within eps of 1", true, "ShadowsRGBGain=1.00000005"},
        {"suppression sliders at 1 but turned", true, "SuppressionAngle0=40"},
        {"pre-divide alone", false, "PreDividePostMultiply=1"},
        {"the range weights shown", false, "RenderOutputRange=1"},
        {"a range's gain", false, "MidTonesRGBGain=1.2"},
    };
    for (const auto &[name, passes, controls] : cases) {
        SCOPED_TRACE(name);
        Ref<Image> src = ts::PatternImage(8, 4, DepthRGBAFlt32);
        Rig rig(src);
        rig.Set(Parse(controls));
        Ref<Image> shape = Render(rig.cc, nullptr, ReqFlagPreCalc);
        ASSERT_TRUE(shape && !shape->HasScanLineData());
        EXPECT_EQ(shape->DataWindow(), ImgRectI(0, 0, 8, 4));
        EXPECT_EQ(rig.source->processCount, 0);
        Ref<Image> out = Render(rig.cc);
        ASSERT_TRUE(out);
        EXPECT_EQ(out.Get() == src.Get(), passes);
    }
}

TEST_F(ColorCorrector, RangeOutputShowsTheWeights) {
    Ref<Image> ramp = NewImageTagList({{ImgWidth, 11}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    ASSERT_TRUE(ramp->AllocScanLineData());
    for (int x = 0; x < 11; ++x) {
        const float v = x / 10.f;
        float *px = ramp->Row<float>(0) + 4 * x;
        px[0] = px[1] = px[2] = v, px[3] = 1.f;
    }
    Rig rig(ramp);
    ts::SetNumber(rig.cc, "RenderOutputRange", 1);
    ts::SetNumber(rig.cc, "MasterRGBGain", 3); // the correction does not show
    for (int shown = 0; shown < 4; ++shown) {
        ts::SetNumber(rig.cc, "RangesRange", shown);
        Ref<Image> out = Render(rig.cc);
        ASSERT_TRUE(out);
        for (int x = 0; x < 11; ++x) {
            const double L = x / 10.0, s = std::max(0.0, 1 - 2 * L), h = std::max(0.0, 2 * L - 1);
            const double w[3] = {s, 1 - s - h, h};
            const Px got = ToPx(out->GetFlt(x, 0));
            const Px want = shown == 0 ? Px{w[0], w[1], w[2], 1} : Px{w[shown - 1], w[shown - 1], w[shown - 1], 1};
            for (int c = 0; c < 4; ++c) EXPECT_NEAR(got[c], want[c], 2.0 / 1023) << shown << " at " << L;
        }
    }
}

/// Expects `a` to hold `b`'s bytes over `r`.
void ExpectSameBits(const Image &a, const Image &b, const ImgRectI &r) {
    for (int y = r.y0; y < r.y1; ++y)
        ASSERT_EQ(std::memcmp(a.PixelAddress(r.x0, y), b.PixelAddress(r.x0, y), size_t(r.Width()) * a.BytesPerPixel()),
                  0)
            << "row " << y;
}

// ---- histogram modes ----

/// An 8-bit grey image 256 x 16 whose pixel i of 4096 holds round(255 f(i / 4096)).
Ref<Image> GreyImage(double (*f)(double)) {
    Ref<Image> img = NewImageTagList({{ImgWidth, 256}, {ImgHeight, 16}, {ImgDepth, DepthRGBAInt8}});
    EXPECT_TRUE(img->AllocScanLineData());
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 256; ++x) {
            uint8_t *px = img->Row<uint8_t>(y) + 4 * x;
            px[0] = px[1] = px[2] = static_cast<uint8_t>(std::lround(255 * f((y * 256 + x) / 4096.0)));
            px[3] = 255;
        }
    return img;
}
double Dark(double u) { return u * u; }
double Bright(double u) { return std::sqrt(u); }

/// The share of the pixels of channel c within `r` at each 8-bit value or below, counted afresh.
std::array<double, 256> Cumulative(const Image &img, const ImgRectI &r, int c) {
    std::array<double, 256> cdf{};
    for (int y = r.y0; y < r.y1; ++y)
        for (int x = r.x0; x < r.x1; ++x) cdf[img.Row<uint8_t>(y)[4 * x + c]] += 1.0 / (r.Width() * r.Height());
    for (int v = 1; v < 256; ++v) cdf[v] += cdf[v - 1];
    return cdf;
}
double Farthest(const std::array<double, 256> &a, const std::array<double, 256> &b) {
    double d = 0;
    for (int v = 0; v < 256; ++v) d = std::max(d, std::fabs(a[v] - b[v]));
    return d;
}
std::array<double, 256> Flat() {
    std::array<double, 256> f;
    for (int v = 0; v < 256; ++v) f[v] = (v + 1) / 256.0;
    return f;
}

// The largest share of one value of Dark(): value 0 holds 1/sqrt(255) of the pixels' cumulative range, 6.3%; the
// result follows the target within half of it and the rounding of a stored 8-bit value.
constexpr double kFollow = 0.0313 + 2.0 / 256;

TEST_F(ColorCorrector, EqualizeFlattensTheHistogramOfEveryChosenCurve) {
    const ImgRectI all(0, 0, 256, 16);
    const std::pair<const char *, const char *> modes[] = {
        {"R/G/B locked", "HistogramType=1 EqualizeRed=1 EqualizeGreen=1 EqualizeBlue=1 Precision=0"},
        {"each channel, 16-bit", "HistogramType=1 LockRedGreenBlue=0 EqualizeRed=1 EqualizeGreen=1 EqualizeBlue=1"},
        {"luminance", "HistogramType=1 EqualizeLuminance=1 Precision=1"},
    };
    Ref<Image> src = GreyImage(Dark);
    ASSERT_GT(Farthest(Cumulative(*src, all, 0), Flat()), 0.2);
    for (const auto &[name, controls] : modes) {
        Rig rig(src);
        rig.Set(Parse(controls));
        Ref<Image> out = Render(rig.cc);
        ASSERT_TRUE(out) << name << ": " << ts::ConsoleText(rig.doc);
        for (int c = 0; c < 3; ++c) EXPECT_LT(Farthest(Cumulative(*out, all, c), Flat()), kFollow) << name << c;
    }
    // Only the chosen channel changes, and half a blend lands half way.
    Rig rig(src);
    rig.Set(Parse("HistogramType=1 LockRedGreenBlue=0 EqualizeGreen=0.5"));
    Ref<Image> full = nullptr, half = Render(rig.cc);
    ts::SetNumber(rig.cc, "EqualizeGreen", 1);
    full = Render(rig.cc);
    ASSERT_TRUE(half && full);
    const ImgRectI roi(40, 3, 90, 9); // a region is the crop of the whole: the histogram still counts every pixel
    Ref<Image> part = Render(rig.cc, &roi);
    ASSERT_TRUE(part);
    ExpectSameBits(*part, *full, roi);
    for (int x = 0; x < 256; x += 17) {
        const uint8_t *in = src->Row<uint8_t>(3) + 4 * x, *h = half->Row<uint8_t>(3) + 4 * x;
        EXPECT_EQ(h[0], in[0]);
        EXPECT_NEAR(h[1], (in[1] + full->Row<uint8_t>(3)[4 * x + 1]) / 2.0, 1.0) << x;
    }
}

TEST_F(ColorCorrector, MatchTakesTheReferencesHistogramWithinTheMatchRectangle) {
    const ImgRectI all(0, 0, 256, 16), left(0, 0, 128, 16);
    Ref<Image> src = GreyImage(Dark), ref = GreyImage(Bright);
    Rig rig(src);
    rig.Set(Parse("HistogramType=2 EqualizeRed=1 EqualizeGreen=1 EqualizeBlue=1 Precision=0"));
    EXPECT_FALSE(Render(rig.cc)) << "no reference";
    const std::string console = ts::ConsoleText(rig.doc);
    EXPECT_EQ(console.rfind("error: " + rig.cc->Name() + ": Match needs a Match Reference", 0), 0u) << console;
    EXPECT_EQ(std::count(console.begin(), console.end(), '\n'), 1) << console;

    ts::ImageSourceTool *refTool = ts::AddImageSource(rig.doc, "Ref", ref);
    ASSERT_TRUE(rig.cc->FindInput("MatchReference")->ConnectTo(refTool->Out()));
    Ref<Image> matched = Render(rig.cc);
    ASSERT_TRUE(matched);
    const auto target = Cumulative(*ref, all, 0);
    ASSERT_GT(Farthest(Cumulative(*src, all, 0), target), 0.3);
    EXPECT_LT(Farthest(Cumulative(*matched, all, 1), target), kFollow);

    // The snapshot keeps the reference after it is gone, through a saved document, until released.
    rig.cc->FindInput("SnapshotMatch")->SetValue(MakeRef<Number>(1.0));
    rig.cc->FindInput("MatchReference")->Disconnect();
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(SaveDocument(rig.doc), *again).ok);
    Operator *loaded = again->FindTool(rig.cc->Name());
    ASSERT_TRUE(loaded && loaded->FindInput("Input")->ConnectTo(ts::AddImageSource(*again, "Fresh", src)->Out()));
    for (Operator *cc : {rig.cc, loaded}) {
        Ref<Image> kept = Render(cc);
        ASSERT_TRUE(kept) << ts::ConsoleText(*cc->GetDoc());
        ExpectSameBits(*kept, *matched, all);
    }
    rig.cc->FindInput("ReleaseMatch")->SetValue(MakeRef<Number>(1.0));
    EXPECT_FALSE(Render(rig.cc));
    // Kept counts that do not add up to their samples are refused with one line, never matched against.
    ScriptVal damaged = ScriptVal::Table();
    for (const char *c : {"L", "R", "G", "B"}) damaged.Set(c, "0 4 255 1 ");
    damaged.Set("Size", 256);
    damaged.Set("Samples", 6); // 5 counted
    rig.cc->FindInput("MatchSnapshotData")->SetValue(MakeRef<ScriptValue>(damaged));
    EXPECT_FALSE(Render(rig.cc));
    EXPECT_NE(ts::ConsoleText(rig.doc).find("the kept match snapshot is damaged"), std::string::npos);

    // The left half dark, the right half white and transparent: counting the left half alone (by the match
    // rectangle, by leaving out transparent pixels, or by a Match Mask over it) equalises it flat; counting
    // everything does not.
    Ref<Image> halves = GreyImage(Dark);
    for (int y = 0; y < 16; ++y)
        for (int x = 128; x < 256; ++x) std::copy_n("\xff\xff\xff\0", 4, halves->Row<uint8_t>(y) + 4 * x);
    Ref<Image> leftMask = MakeRef<Image>(256, 16, DepthAInt8);
    ASSERT_TRUE(leftMask->AllocScanLineData());
    for (int y = 0; y < 16; ++y) std::fill_n(leftMask->Row<uint8_t>(y), 128, uint8_t(200)); // above one half
    const std::tuple<const char *, bool, bool, bool> counted[] = {
        // controls, match rectangle over the left half, mask over the left half, comes out flat
        {"", false, false, false},
        {"MatchWidth=0.5", true, false, true},
        {"HistogramIgnoreTransparent=1", false, false, true},
        {"", false, true, true},
    };
    for (const auto &[controls, inRect, masked, flat] : counted) {
        Rig split(halves);
        split.Set(Parse(std::string("HistogramType=1 EqualizeRed=1 Precision=0 ") + controls));
        if (inRect) ts::SetPoint(split.cc, "MatchCenter", 0.25, 0.5);
        if (masked) {
            ASSERT_TRUE(
                split.cc->FindInput("MatchMask")->ConnectTo(ts::AddImageSource(split.doc, "Mask", leftMask)->Out()));
        }
        Ref<Image> out = Render(split.cc);
        ASSERT_TRUE(out) << controls;
        const double off = Farthest(Cumulative(*out, left, 0), Flat());
        EXPECT_TRUE(flat ? off < kFollow : off > 0.2) << controls << ": " << off;
    }
}

TEST_F(ColorCorrector, CanvasRegionsAndThreadCountLeaveTheResultAlone) {
    const ImgRectI inWindow(8, 4, 40, 28);
    const FltPixel canvas{0.2f, 0.4f, 0.6f, 0.8f};
    const Controls controls = Parse(kSettings[std::size(kSettings) - 2].second); // ranges with master
    const int before = WorkerCount();
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8}) {
        SCOPED_TRACE(depth);
        Ref<Image> src = ts::WindowedImage(48, 32, inWindow, canvas, 3, depth);
        Rig rig(src);
        rig.Set(controls);
        const ToolModel model{controls, rig.cc};
        SetWorkerCount(1);
        Ref<Image> one = Render(rig.cc);
        SetWorkerCount(std::max(2, before));
        Ref<Image> out = Render(rig.cc);
        SetWorkerCount(before);
        ASSERT_TRUE(one && out && one.Get() != out.Get());
        ExpectSameBits(*one, *out, out->DataWindow());
        ASSERT_EQ(out->DataWindow(), inWindow);
        // The canvas goes through the same function, once.
        bool edge;
        const Px want = model.Pixel(ToPx(canvas), edge);
        const Px got = ToPx(out->GetCanvasColor());
        for (int c = 0; c < 4; ++c)
            EXPECT_NEAR(got[c], out->IsFloat() ? want[c] : std::clamp(want[c], 0.0, 1.0),
                        depth == DepthRGBAFlt32  ? 1e-5
                        : depth == DepthRGBAInt8 ? 0.5 / 255 + 1e-5
                                                 : 1e-3);
        // A region of interest is the crop of the whole render, beyond the data and the frame too.
        for (const ImgRectI &roi : {ImgRectI(5, 7, 30, 20), ImgRectI(0, 0, 10, 5), ImgRectI(38, 25, 60, 40)}) {
            Ref<Image> part = Render(rig.cc, &roi);
            ASSERT_TRUE(part && part->DataWindow() == (inWindow & roi));
            EXPECT_EQ(part->GetCanvasColor(), out->GetCanvasColor());
            ExpectSameBits(*part, *out, inWindow & roi);
        }
        // Frame clipping: beyond the data, the processed canvas colour fills the frame.
        ts::SetID(rig.cc, "ClippingMode", "ClippingMode_Frame");
        Ref<Image> framed = Render(rig.cc);
        ASSERT_TRUE(framed && framed->DataWindow() == ImgRectI(0, 0, 48, 32));
        EXPECT_EQ(ToPx(framed->GetFlt(2, 2)), got);
        ExpectSameBits(*framed, *out, inWindow);
    }
}

TEST_F(ColorCorrector, RangeCurvesAndPresetsSurviveASavedDocument) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Operator *cc = doc->AddTool(OvID("ColorCorrector"));
    ASSERT_TRUE(cc);
    Input *curves = cc->FindInput("ColorRanges");
    EXPECT_TRUE(curves->Default()->Equals(ColorCurvesTable()));
    // The preset buttons set the curves.
    cc->FindInput("PresetSmoothRanges")->SetValue(MakeRef<Number>(1.0));
    EXPECT_TRUE(curves->Constant()->Equals(ColorCurvesTable(ColorCurvesTable::Preset::Smooth)));
    cc->FindInput("PresetSimpleRanges")->SetValue(MakeRef<Number>(1.0));
    EXPECT_TRUE(curves->Constant()->Equals(ColorCurvesTable()));

    const Ref<ColorCurvesTable> custom = MakeRef<ColorCurvesTable>(
        RangeCurve{{{0.0, 1.0}, {0.35, 0.1}, {0.6, 0.0}}, true}, RangeCurve{{{0.5, 0.0}, {0.9, 1.0}}, false});
    ASSERT_TRUE(curves->SetValue(custom));
    ts::SetNumber(cc, "ShadowsRGBGain", 1.5);
    const std::string text = SaveDocument(*doc);
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    const DocumentLoadResult loaded = LoadDocument(text, *again);
    ASSERT_TRUE(loaded.ok) << loaded.error;
    Operator *back = again->FindTool(cc->Name());
    ASSERT_TRUE(back);
    EXPECT_TRUE(back->FindInput("ColorRanges")->Constant()->Equals(*custom));
    EXPECT_EQ(SaveDocument(*again), text);

    // A malformed curve is reported as a document problem, not taken.
    std::string broken = text;
    const size_t at = broken.find("Points");
    ASSERT_NE(at, std::string::npos);
    broken.replace(at, 6, "Pointz");
    Ref<OrvaneDoc> bad = MakeRef<OrvaneDoc>();
    const DocumentLoadResult refused = LoadDocument(broken, *bad);
    EXPECT_FALSE(refused.ok && refused.warnings.empty());
}

TEST_F(ColorCorrector, MenuShowsOneGroupForTheChosenRangeAndResetsClearOnlyTheirGroup) {
    OrvaneDoc doc;
    Operator *cc = doc.AddTool(OvID("ColorCorrector"));
    ASSERT_TRUE(cc);
    auto visible = [cc](const char *id) { return cc->FindInput(id)->IsVisible(); };
    // Menu, range, channel; an input of each group for that choice is shown, the others are not.
    const std::tuple<int, int, int, const char *> choices[] = {{0, 0, 0, "MasterRGBGain"},
                                                               {0, 2, 3, "MidTonesBlueLift"},
                                                               {1, 3, 1, "HighlightsRedOutputHigh"},
                                                               {2, 1, 0, "HistogramType"},
                                                               {3, 1, 2, "Magenta1"}};
    for (const auto &[menu, range, channel, shown] : choices) {
        ts::SetNumbers(cc, {{"Menu", menu}, {"CorrectionRange", range}, {"Channel", channel}});
        int count = 0;
        for (const auto &[m, r, ch, id] : choices) count += visible(id);
        EXPECT_TRUE(visible(shown)) << shown;
        EXPECT_EQ(count, 1) << shown;
    }
    ts::SetNumbers(cc, {{"MasterRGBGain", 2}, {"MasterRGBLow", 0.2}, {"Red0", 0.5}, {"WheelHue3", 10}});
    cc->FindInput("ResetAllColorChanges")->SetValue(MakeRef<Number>(1.0));
    auto value = [cc](const char *id) { return dynamic_cast<const Number &>(*cc->FindInput(id)->Constant()).value; };
    EXPECT_EQ(value("MasterRGBGain"), 1.0);
    EXPECT_EQ(value("WheelHue3"), 0.0);
    EXPECT_EQ(value("MasterRGBLow"), 0.2) << "levels are not colours";
    EXPECT_EQ(value("Red0"), 0.5);
    cc->FindInput("ResetAllSuppression")->SetValue(MakeRef<Number>(1.0));
    EXPECT_EQ(value("Red0"), 1.0);
}

TEST_F(ColorCorrector, DeviceMatchesTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    // Float results agree to the rounding of the power (the device's powf against the rows' vectorised power);
    // stored depths to their step.
    const std::pair<int, double> depths[] = {
        {DepthRGBAFlt32, 2e-5}, {DepthRGBAFlt16, 1e-3}, {DepthRGBAInt16, 1.01 / 65535}, {DepthRGBAInt8, 1.01 / 255}};
    std::vector<std::pair<const char *, std::string>> cases(std::begin(kSettings), std::end(kSettings));
    cases.emplace_back("range weights shown", "RenderOutputRange=1 RangesRange=2 PreDividePostMultiply=1");
    // The histogram modes' kernel does the rows' arithmetic exactly: the same bits (but for pre-divide, where the
    // device's division may round otherwise and so move a value to the next bin).
    cases.emplace_back("equalize", "HistogramType=1 EqualizeRed=1 EqualizeGreen=0.6 EqualizeBlue=1 Precision=0");
    cases.emplace_back("equalize, luminance too",
                       "HistogramType=1 EqualizeLuminance=0.7 LockRedGreenBlue=0 EqualizeBlue=1 Precision=1");
    cases.emplace_back("match", "HistogramType=2 EqualizeLuminance=1 EqualizeRed=1 SmoothOutCorrectionCurve=0.3");
    const ImgRectI dw(-3, 5, 50, 38), roi(12, 2, 61, 33);
    for (const auto &[depth, tol] : depths) {
        Ref<Image> src = ts::PatternImage(64, 40, depth, 5)->CopyOfImageTagList({{ImgDataWindow, &dw}});
        src->SetCanvasColor(FltPixel{0.2f, -0.1f, 0.6f, 0.5f});
        for (const auto &[name, text] : cases) {
            SCOPED_TRACE(std::string(name) + ", depth " + std::to_string(depth));
            const bool histogram = text.find("HistogramType") != std::string::npos;
            Rig rig(src);
            rig.Set(Parse(text));
            ASSERT_TRUE(rig.cc->FindInput("MatchReference")
                            ->ConnectTo(ts::AddImageSource(rig.doc, "Ref", ts::PatternImage(30, 20, depth, 9))->Out()));
            Ref<Image> cpu = Render(rig.cc, &roi);
            RenderTask task;
            task.SetDevice(ctx);
            EvalOptions opt;
            opt.task = &task, opt.useCache = false, opt.roi = ImageDomain(roi);
            const int launches = ctx->LaunchCount();
            Ref<Image> dev = ts::EvalImage(rig.cc, 0.0, opt);
            ASSERT_TRUE(cpu && dev);
            EXPECT_GT(ctx->LaunchCount(), launches) << "the device ran";
            EXPECT_TRUE(task.DeviceLog().empty()) << task.DeviceLog().front();
            ASSERT_EQ(dev->DataWindow(), cpu->DataWindow());
            EXPECT_EQ(dev->GetCanvasColor(), cpu->GetCanvasColor());
            const ImgRectI w = cpu->DataWindow();
            for (int y = w.y0; y < w.y1; ++y)
                for (int x = w.x0; x < w.x1; ++x) {
                    const Px a = ToPx(dev->GetFlt(x, y)), b = ToPx(cpu->GetFlt(x, y));
                    for (int c = 0; c < 4; ++c)
                        ASSERT_NEAR(a[c], b[c], tol * std::max(1.0, std::fabs(b[c])) * !histogram)
                            << x << "," << y << " ch " << c;
                }
        }
    }
}

} // namespace
} // namespace Orvane::cctest
