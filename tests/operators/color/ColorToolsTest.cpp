#include <filesystem>

#include <gtest/gtest.h>

#include "host/color/ColorConfig.h"
#include "host/core/Parallel.h"
#include "host/flow/InputValue.h"
#include "host/media/Clip.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::colortoolstest {
namespace T = Orvane::Test;

using Px = std::array<double, 4>;
using Rgb = std::array<double, 3>;
using Numbers = std::vector<std::pair<const char *, double>>;
using Texts = std::vector<std::pair<const char *, std::string>>;

inline Px ToPx(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }
inline double Luminance(const Px &p) { return 0.2126 * p[0] + 0.7152 * p[1] + 0.0722 * p[2]; }

/// A document: an image source, then tools added one after the other (`cls` the first).
struct Chain {
    OrvaneDoc doc;
    T::ImageSourceTool *source;
    Operator *last;
    explicit Chain(Ref<Image> img, const char *cls = nullptr)
        : source(T::AddImageSource(doc, "Src", std::move(img))), last(source) {
        if (cls) Add(cls);
    }
    Operator *Add(const char *cls, const Texts &texts = {}, const Numbers &numbers = {}) {
        Operator *op = doc.AddTool(OvID(cls));
        EXPECT_TRUE(op && op->FindInput("Input")->ConnectTo(last->FindMainOutput()));
        if (!op) return last;
        for (const auto &[id, text] : texts) T::SetText(op, id, text);
        T::SetNumbers(op, numbers);
        return last = op;
    }
    /// The last tool's output without the cache (on `device` in `task` when given); null when it failed.
    Ref<Image> Run(const ImgRectI *roi = nullptr, uint32_t flags = 0, IDeviceContext *device = nullptr,
                   RenderTask *task = nullptr) {
        RenderTask own, &t = task ? *task : own;
        t.SetDevice(device);
        EvalOptions opt;
        opt.task = &t, opt.flags = flags, opt.useCache = false;
        if (roi) opt.roi = ImageDomain(*roi);
        return T::EvalImage(last, 0.0, opt);
    }
};

/// One row of float pixels of the given colours, alpha `alpha`.
inline Ref<Image> ColourRow(const std::vector<Rgb> &colours, float alpha = 1.f) {
    Ref<Image> img = NewImageTagList({{ImgWidth, int(colours.size())}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    for (size_t x = 0; x < colours.size(); ++x)
        img->PutFlt(int(x), 0, {float(colours[x][0]), float(colours[x][1]), float(colours[x][2]), alpha});
    return img;
}

/// Expects the colours of row 0 each within `tol` of the wanted one.
inline void ExpectColoursNear(const Ref<Image> &img, const std::vector<Rgb> &want, double tol) {
    ASSERT_TRUE(img && img->Width() == int(want.size()));
    for (size_t i = 0; i < want.size(); ++i)
        for (int c = 0; c < 3; ++c) EXPECT_NEAR(ToPx(img->GetFlt(int(i), 0))[c], want[i][c], tol) << i << "/" << c;
}

/// Expects `out` null and the document's console to hold `line`.
inline void ExpectFailure(const Ref<Image> &out, const OrvaneDoc &doc, const std::string &line) {
    EXPECT_TRUE(!out && T::ConsoleText(doc).find(line) != std::string::npos) << T::ConsoleText(doc);
}

/// `src` through oiiotool with `args` between reading and writing (the files in `dir`); null when it failed.
inline Ref<Image> ThroughOiiotool(const Image &src, const std::string &dir, const std::string &args) {
    T::WritePfm(src, dir + "/oiio-in.pfm");
    if (!T::RunQuiet("oiiotool " + dir + "/oiio-in.pfm " + args + " -o " + dir + "/oiio-out.exr")) return nullptr;
    return T::ReadOiioDump(dir + "/oiio-out.exr", src.Width(), src.Height());
}

/// The largest difference of the first `channels` channels of `a` from `b` over `r` (or relative to `b` above 1).
inline double WorstDifference(const Image &a, const Image &b, const ImgRectI &r, int channels = 3,
                              bool relative = false) {
    double worst = 0;
    for (int y = r.y0; y < r.y1; ++y)
        for (int x = r.x0; x < r.x1; ++x)
            for (int c = 0; c < channels; ++c) {
                const double want = ToPx(b.GetFlt(x, y))[c], d = std::fabs(ToPx(a.GetFlt(x, y))[c] - want);
                worst = std::max(worst, relative ? d / std::max(1.0, std::fabs(want)) : d);
            }
    return worst;
}

using Setter = std::function<void(Operator *)>;
using Model = std::function<Px(const Image &src, const Px &in)>;
const std::vector<int> kFloatAndInt16 = {DepthRGBAFlt32, DepthRGBAInt16};
const std::vector<int> kEveryDepth = {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16,
                                      DepthRGBAInt8,  DepthAFlt32,    DepthAInt16};

/// The frame rules of tool `cls` (`set` makes its settings) at each of `depths` under each clipping mode, `model`
/// giving the colour of an input colour (a mask: its value in every channel) within `tol` (float16: 1.5e-3, relative
/// above 1; integers: the nearest code or `tol`): data window, canvas colour (processed, or kept under Domain and
/// Frame), the processed canvas beyond the input's window, pre-calculation without pixels, regions (the source cutting
/// its image to them) of the same values as the whole frame (cut to the region unless `cropsToRegion` is false), and
/// workers.
inline void ExpectFrameRules(const char *cls, const Setter &set, const Model &model, double tol,
                             const std::vector<int> &depths = kFloatAndInt16, bool cropsToRegion = true) {
    const ImgRectI inWindow(8, 4, 40, 28);
    const std::tuple<const char *, ImgRectI, bool> clips[] = {{"ClippingMode_None", inWindow, false},
                                                              {"ClippingMode_Domain", inWindow, true},
                                                              {"ClippingMode_Frame", ImgRectI(0, 0, 48, 32), true}};
    for (int depth : depths)
        for (const auto &[mode, window, keepsCanvas] : clips) {
            SCOPED_TRACE(std::string(mode) + ", depth " + std::to_string(depth));
            Ref<Image> src = T::WindowedImage(48, 32, inWindow, {0.2f, 0.4f, 0.6f, 0.8f}, 3, depth);
            const bool isFloat = src->IsFloat(), mask = src->IsMask();
            const double step = isFloat ? 0 : depth == DepthRGBAInt8 ? 1.0 / 255 : 1.0 / 65535;
            auto expected = [&](const FltPixel &p) { return model(*src, mask ? Px{p.A, p.A, p.A, p.A} : ToPx(p)); };
            auto expectNear = [&](const Px &got, const Px &want, int x, int y) {
                for (int c = mask ? 3 : 0; c < 4; ++c) {
                    const double w = isFloat ? want[c] : std::clamp(want[c], 0.0, 1.0);
                    ASSERT_NEAR(got[c], w,
                                isFloat ? (depth == DepthRGBAFlt16 ? 1.5e-3 : tol) * std::max(1.0, std::fabs(w))
                                        : std::max(0.52 * step, tol))
                        << x << "," << y << " channel " << c;
                }
            };
            Chain chain(src, cls);
            set(chain.last);
            T::SetID(chain.last, "ClippingMode", mode);
            Ref<Image> shape = chain.Run(nullptr, ReqFlagPreCalc), out = chain.Run();
            ASSERT_TRUE(shape && shape->IsNoData() && !shape->HasScanLineData() && shape->DataWindow() == window);
            ASSERT_TRUE(out && out.Get() != src.Get() && out->DataWindow() == window);
            const Px processedCanvas = expected(src->GetCanvasColor());
            if (keepsCanvas)
                EXPECT_EQ(out->GetCanvasColor(), src->GetCanvasColor());
            else
                expectNear(ToPx(out->GetCanvasColor()), processedCanvas, -1, -1);
            for (int y = window.y0; y < window.y1; ++y)
                for (int x = window.x0; x < window.x1; ++x)
                    expectNear(ToPx(out->GetFlt(x, y)),
                               inWindow.Contains(x, y) ? expected(src->GetFlt(x, y)) : processedCanvas, x, y);
            chain.source->cutToRegion = true;
            for (const ImgRectI &roi : {ImgRectI(5, 7, 30, 20), ImgRectI(0, 0, 10, 5), ImgRectI(38, 25, 60, 40)}) {
                Ref<Image> part = chain.Run(&roi);
                const ImgRectI rendered = cropsToRegion ? window & roi : window;
                ASSERT_TRUE(part && part->DataWindow() == rendered && part->ValidWindow() == rendered);
                EXPECT_EQ(part->GetCanvasColor(), out->GetCanvasColor());
                EXPECT_EQ(WorstDifference(*part, *out, window & roi, 4), 0);
            }
            const int before = WorkerCount();
            SetWorkerCount(1);
            Ref<Image> one = chain.Run();
            SetWorkerCount(before);
            EXPECT_TRUE(one && one.Get() != out.Get() && WorstDifference(*one, *out, window, 4) == 0) << "one worker";
        }
}

/// The tools loaded once, a folder for files, no configuration named by the environment.
class ColorTools : public ::testing::Test {
protected:
    static void SetUpTestSuite() { T::LoadOperators(); }
    void SetUp() override { unsetenv("OCIO"); }
    void TearDown() override { unsetenv("OCIO"); }
    /// Sets inputs as a document does.
    static void Set(OrvaneDoc &doc, Operator *op, const std::vector<std::pair<const char *, ScriptVal>> &values) {
        for (const auto &[id, value] : values) ASSERT_EQ(ApplyInputValue(doc, op->FindInput(id), value), "") << id;
    }
    std::string Write(const std::string &name, const std::string &text) {
        std::ofstream(dir / name) << text;
        return dir / name;
    }
    T::TempDir dir;
};

/// One step's settings: index 0..3 red, green, blue, alpha, 4 the master (saturation: 3 is the master).
struct Step {
    double gain[5] = {1, 1, 1, 1, 1}, lift[5] = {0, 0, 0, 0, 0}, gamma[5] = {1, 1, 1, 1, 1}, sat[4] = {1, 1, 1, 1};
};
/// The whole image, then shadows, midtones, highlights.
struct Settings {
    Step step[4];
    double shadowsEnd = 0.5, highlightsStart = 0.5;
};

void Apply(Operator *op, const Settings &s) {
    const char *steps[] = {"", "Shadows", "Midtones", "Highlights"}, *chans[] = {"Red", "Green", "Blue", "Alpha", ""};
    for (int r = 0; r < 4; ++r)
        for (int c = 0; c < 5; ++c) {
            const std::string pre = std::string(steps[r]) + chans[c];
            for (const auto &[name, v] :
                 {std::pair{"Gain", s.step[r].gain}, {"Lift", s.step[r].lift}, {"Gamma", s.step[r].gamma}})
                T::SetNumber(op, (pre + name).c_str(), v[c]);
            if (c != 3) T::SetNumber(op, (pre + "Saturation").c_str(), s.step[r].sat[c == 4 ? 3 : c]);
        }
    T::SetNumbers(op, {{"ShadowsEnd", s.shadowsEnd}, {"HighlightsStart", s.highlightsStart}});
}

Px ModelStep(const Step &s, Px p) {
    for (int c = 0; c < 4; ++c) {
        const bool color = c < 3; // the master leaves alpha alone
        p[c] = p[c] * s.gain[c] * (color ? s.gain[4] : 1) + s.lift[c] + (color ? s.lift[4] : 0);
        const double gamma = s.gamma[c] * (color ? s.gamma[4] : 1);
        if (std::fabs(gamma - 1) >= 1.1920929e-07)
            p[c] = std::copysign(std::pow(std::fabs(p[c]), gamma < 1e-5 ? 1e5 : 1 / gamma), p[c]);
    }
    const double y = Luminance(p);
    for (int c = 0; c < 3; ++c) p[c] = y + s.sat[c] * s.sat[3] * (p[c] - y);
    return p;
}

Px GainModel(const Settings &s, const Px &in) {
    auto smooth = [](double t) { return t <= 0 ? 0 : t >= 1 ? 1 : t * t * (3 - 2 * t); };
    const Px p = ModelStep(s.step[0], in);
    const double y = Luminance(p);
    const double sh = 1 - (s.shadowsEnd > 0 ? smooth(y / s.shadowsEnd) : y > 0);
    const double hi = s.highlightsStart < 1 ? smooth((y - s.highlightsStart) / (1 - s.highlightsStart)) : y >= 1;
    const double w[3] = {sh, 1 - sh - hi, hi}; // shadows, midtones, highlights
    Px out{};
    for (int r = 0; r < 3; ++r) {
        const Px q = ModelStep(s.step[r + 1], p);
        for (int c = 0; c < 4; ++c) out[c] += w[r] * q[c];
    }
    return out;
}

/// Named settings that cover the matrix route and the rows.
std::vector<std::pair<const char *, Settings>> Cases() {
    std::vector<std::pair<const char *, Settings>> cases;
    auto add = [&](const char *name, auto set) { cases.emplace_back(name, Settings{}), set(cases.back().second); };
    add("gains, lift and saturations (matrix)", [](Settings &s) {
        s.step[0].gain[4] = 1.3, s.step[0].lift[4] = 0.05, s.step[0].gain[3] = 0.8, s.step[0].gain[0] = 1.2;
        s.step[0].gain[2] = 0.8, s.step[0].sat[3] = 0.6, s.step[0].sat[1] = 1.5;
    });
    add("shadows lift, midtones gamma and saturation, highlights gain", [](Settings &s) {
        s.step[1].lift[4] = 0.1, s.step[3].gain[4] = 0.7, s.shadowsEnd = 0.3, s.highlightsStart = 0.6;
        s.step[0].gain[4] = 1.1, s.step[2].gamma[4] = 1.8, s.step[2].sat[3] = 0.5, s.step[2].gain[1] = 1.2;
    });
    add("gamma per channel, ranges of no width", [](Settings &s) {
        s.step[0].gamma[4] = 1.4, s.step[0].gamma[0] = 0.7, s.step[0].gamma[3] = 2.0, s.step[0].lift[2] = 0.1;
        s.step[0].gamma[1] = 0.5, s.step[0].sat[3] = 1.3, s.step[1].gamma[2] = 1.5, s.step[3].lift[0] = -0.05;
        s.step[3].sat[3] = 0, s.shadowsEnd = 0, s.highlightsStart = 1;
    });
    add("the same in every range", [](Settings &s) {
        for (int r = 1; r < 4; ++r) s.step[r].gain[4] = 1.25, s.step[r].gamma[2] = 1.6, s.step[r].sat[3] = 0.4;
        s.shadowsEnd = 0.2, s.highlightsStart = 0.7;
    });
    return cases;
}

TEST_F(ColorTools, ColorGainMatchesTheModelOnEveryDepthAndKeepsTheFrameRules) {
    for (const auto &[name, s] : Cases()) {
        SCOPED_TRACE(name);
        auto set = [&s = s](Operator *op) { Apply(op, s); };
        auto model = [&s = s](const Image &, const Px &p) { return GainModel(s, p); };
        ExpectFrameRules("ColorGain", set, model, 2e-6, kEveryDepth);
    }
}

TEST_F(ColorTools, ColorGainTheDeviceMatchesTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    // The device's powf against the rows' powers; integers are the rows' tables in double against float.
    const std::pair<int, double> depths[] = {
        {DepthRGBAFlt32, 2e-5}, {DepthRGBAFlt16, 1e-3}, {DepthRGBAInt16, 1.01 / 65535}, {DepthRGBAInt8, 1.01 / 255}};
    const ImgRectI window(-3, 5, 50, 38), roi(12, 2, 61, 33);
    for (const auto &[name, s] : Cases())
        for (const auto &[depth, tol] : depths) {
            SCOPED_TRACE(std::string(name) + ", depth " + std::to_string(depth));
            Chain chain(T::WindowedImage(64, 40, window, {0.2f, -0.1f, 0.6f, 0.5f}, 5, depth), "ColorGain");
            Apply(chain.last, s);
            const int launches = ctx->LaunchCount();
            RenderTask task;
            Ref<Image> cpu = chain.Run(&roi), dev = chain.Run(&roi, 0, ctx, &task);
            ASSERT_TRUE(cpu && dev && dev->DataWindow() == cpu->DataWindow());
            EXPECT_TRUE(ctx->LaunchCount() > launches && dev->GetCanvasColor() == cpu->GetCanvasColor()) << "ran";
            EXPECT_TRUE(task.DeviceLog().empty()) << task.DeviceLog().front();
            EXPECT_LE(WorstDifference(*dev, *cpu, cpu->DataWindow(), 4, true), tol);
        }
}

Numbers Picked(const Px &n, double space) {
    return {{"Method", 0}, {"Space", space}, {"NeutralRed", n[0]}, {"NeutralGreen", n[1]}, {"NeutralBlue", n[2]}};
}

/// Linear Rec. 709 RGB of the white at CIE xy (luminance 1), by the published XYZ to RGB matrix.
Rgb WhiteOf(double x, double y) {
    const double X = x / y, Z = (1 - x - y) / y;
    return {3.2404542 * X - 1.5371385 - 0.4985314 * Z, -0.9692660 * X + 1.8760108 + 0.0415560 * Z,
            0.0556434 * X - 0.2040259 + 1.0572252 * Z};
}

TEST_F(ColorTools, WhiteBalanceAPickedColourBecomesTheGreyOfItsLuminanceAndTheFrameRulesHold) {
    const Px picked[] = {{0.8, 0.5, 0.3, 1}, {0.2, 0.25, 0.6, 1}, {1.4, 1.1, 0.9, 1}, {0.05, 0.5, 0.05, 1}};
    for (double space : {0.0, 1.0})
        for (const Px &n : picked) {
            SCOPED_TRACE(std::to_string(n[0]) + "," + std::to_string(n[1]) + (space ? " cones" : " RGB"));
            // Premultiplied by 0.4: the same grey times alpha.
            Chain chain(ColourRow({{0.4 * n[0], 0.4 * n[1], 0.4 * n[2]}}, 0.4f), "WhiteBalance");
            T::SetNumbers(chain.last, Picked(n, space));
            const double y = 0.4 * Luminance(n);
            ExpectColoursNear(chain.Run(), {{y, y, y}}, 2e-6);
        }
    // In RGB, a scale of each channel on every depth.
    const Px n{0.6, 0.45, 0.3, 1};
    auto set = [&](Operator *op) { T::SetNumbers(op, Picked(n, 0)); };
    auto model = [&](const Image &, const Px &p) {
        const double y = Luminance(n);
        return Px{p[0] * y / n[0], p[1] * y / n[1], p[2] * y / n[2], p[3]};
    };
    ExpectFrameRules("WhiteBalance", set, model, 2e-6, kEveryDepth);
}

TEST_F(ColorTools, WhiteBalanceTemperatureWhitesMatchPublishedChromaticitiesAndReverseUndoesForward) {
    // Planckian whites (2856 K is CIE illuminant A) become those of the target, as the locus approximation allows.
    const double whites[][3] = {{2856, 0.44757, 0.40745}, {5000, 0.3451, 0.3516}, {6500, 0.3135, 0.3236}};
    for (const auto &from : whites)
        for (const auto &to : whites)
            for (double space : {0.0, 1.0}) {
                SCOPED_TRACE(std::to_string(from[0]) + " K to " + std::to_string(to[0]) + (space ? " K, cones" : " K"));
                Chain chain(ColourRow({WhiteOf(from[1], from[2])}), "WhiteBalance");
                T::SetNumbers(chain.last, {{"Method", 1}, {"Space", space}, {"Temperature", from[0]}});
                T::SetNumber(chain.last, "TargetTemperature", to[0]);
                ExpectColoursNear(chain.Run(), {WhiteOf(to[1], to[2])}, 0.01);
            }
    // Tint: a source white said to be greener is corrected by taking green away.
    Chain chain(ColourRow({{1, 1, 1}}), "WhiteBalance");
    T::SetNumbers(chain.last, {{"Method", 1}, {"Tint", 10}});
    const Ref<Image> out = chain.Run();
    ASSERT_TRUE(out && out->GetFlt(0, 0).G < std::min(out->GetFlt(0, 0).R, out->GetFlt(0, 0).B) - 0.01);
    const Numbers settings[] = {Picked({0.7, 0.5, 0.2, 1}, 0),
                                Picked({0.3, 0.6, 0.9, 1}, 1),
                                {{"Method", 1}, {"Temperature", 3200}, {"Tint", -7}, {"TargetTemperature", 7500}}};
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16})
        for (const Numbers &values : settings) {
            SCOPED_TRACE("depth " + std::to_string(depth) + ", Method " + std::to_string(values[0].second));
            Ref<Image> src = T::PatternImage(40, 9, depth, 11);
            Chain chain(src);
            chain.Add("WhiteBalance", {}, values);
            T::SetNumber(chain.Add("WhiteBalance", {}, values), "Direction", 1);
            Ref<Image> out = chain.Run();
            ASSERT_TRUE(out);
            EXPECT_LE(WorstDifference(*out, *src, src->DataWindow(), 4, true), depth == DepthRGBAFlt32 ? 1e-5 : 4e-3);
        }
}

TEST_F(ColorTools, WhiteBalanceNeutralSettingsOfBothToolsHandTheInputOnAndBadOnesFailWithOneLine) {
    // The second row changes ColorGain by less than its test for neutral settings; the last two: no red, no blue.
    const std::tuple<const char *, Numbers, const char *> cases[] = {
        {"ColorGain", {}, nullptr},
        {"ColorGain", {{"Gain", 1 + 5e-8}, {"MidtonesGreenLift", 1e-8}, {"ShadowsEnd", 0.1}}, nullptr},
        {"ColorGain", {{"ShadowsEnd", 0.6}, {"HighlightsStart", 0.4}}, ": Shadows End"},
        {"WhiteBalance", {}, nullptr},
        {"WhiteBalance", Picked({0.3, 0.3, 0.3, 1}, 1), nullptr},
        {"WhiteBalance",
         {{"Method", 1}, {"Temperature", 3000}, {"Tint", 4}, {"TargetTemperature", 3000}, {"TargetTint", 4}},
         nullptr},
        {"WhiteBalance", Picked({0, 0.5, 0.5, 1}, 0), ": the neutral color"},
        {"WhiteBalance", {{"Method", 1}, {"Space", 0}, {"Temperature", 1667}}, ": the temperature's white"}};
    for (const auto &[cls, values, line] : cases) {
        Ref<Image> src = T::PatternImage(8, 4, DepthRGBAFlt16);
        Chain chain(src);
        chain.Add(cls, {}, values);
        Ref<Image> out = chain.Run();
        const auto lines = chain.doc.ConsoleLines();
        if (!line)
            EXPECT_TRUE(out.Get() == src.Get() && lines.empty()) << cls;
        else
            EXPECT_TRUE(!out && lines.size() == 1 && lines[0].text.rfind(chain.last->Name() + line, 0) == 0) << cls;
    }
}

struct Stretch {
    double low = 0, high = 1;
    bool separate = false;
};

Numbers Values(const Stretch &s) { return {{"Low", s.low}, {"High", s.high}, {"Channels", double(s.separate)}}; }

/// The stretch of `p` from the lowest and highest finite values of `src`'s data window (RGB together or each; a mask:
/// alpha) to Low and High.
Px StretchModel(const Stretch &s, const Image &src, Px p) {
    const int first = src.IsMask() ? 3 : 0, last = src.IsMask() ? 4 : 3;
    double lo[4] = {INFINITY, INFINITY, INFINITY, INFINITY}, hi[4] = {-INFINITY, -INFINITY, -INFINITY, -INFINITY};
    const ImgRectI dw = src.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x)
            for (int c = first; c < last; ++c) {
                const double v = ToPx(src.GetFlt(x, y))[c];
                const int k = s.separate ? c : first;
                if (std::isfinite(v)) lo[k] = std::min(lo[k], v), hi[k] = std::max(hi[k], v);
            }
    for (int c = first; c < last; ++c) {
        const int k = s.separate ? c : first;
        if (hi[k] - lo[k] > 1.1920929e-07) p[c] = s.low + (p[c] - lo[k]) * (s.high - s.low) / (hi[k] - lo[k]);
    }
    return p;
}

TEST_F(ColorTools, AutoGainMatchesTheStretchOfItsOwnMeasurementSkipsValuesThatAreNotFiniteAndHandsFlatImagesOn) {
    for (const Stretch &s : {Stretch{0.1, 0.8, false}, {0.1, 0.8, true}, {1, 0, false}, {-0.2, 1.3, true}}) {
        SCOPED_TRACE(std::to_string(s.low) + ".." + std::to_string(s.high) + (s.separate ? " separate" : ""));
        auto set = [&](Operator *op) { T::SetNumbers(op, Values(s)); };
        auto model = [&](const Image &src, const Px &p) { return StretchModel(s, src, p); };
        ExpectFrameRules("AutoGain", set, model, 2e-6, kEveryDepth);
    }
    const float nan = std::numeric_limits<float>::quiet_NaN(), inf = std::numeric_limits<float>::infinity();
    Ref<Image> odd = T::PatternImage(16, 4, DepthRGBAFlt32, 2);
    odd->PutFlt(3, 1, {nan, inf, -inf, 1});
    odd->PutFlt(7, 2, {40, 0.5f, 0.5f, 1}); // one bright pixel sets the top for every channel together
    Chain chain(odd, "AutoGain");
    Ref<Image> out = chain.Run();
    ASSERT_TRUE(out);
    EXPECT_NEAR(out->GetFlt(7, 2).R, 1.0, 1e-6);
    EXPECT_TRUE(std::isnan(out->GetFlt(3, 1).R));
    for (int x = 0; x < 16; ++x)
        EXPECT_NEAR(out->GetFlt(x, 0).G, StretchModel({}, *odd, ToPx(odd->GetFlt(x, 0)))[1], 1e-6);
    // Nothing to stretch: a flat image, a flat channel alone, or a range that is already Low to High.
    Ref<Image> flat = NewImageTagList({{ImgWidth, 6}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt16}});
    flat->Fill(FltPixel{0.3f, 0.3f, 0.3f, 1.f});
    Ref<Image> ramp = ColourRow({{0, 0, 0}, {1, 1, 1}});
    for (const auto &[img, separate] : {std::pair{flat, false}, {flat, true}, {ramp, false}, {ramp, true}}) {
        Chain c(img);
        c.Add("AutoGain", {}, Values({0, 1, separate}));
        EXPECT_EQ(c.Run().Get(), img.Get());
    }
}

// The sRGB curve, its toe where the power's tangent meets black (slope 12.923; published rounded to 12.92).
constexpr double kA = 0.055, kG = 2.4, kBreak = kA / (kG - 1);
const double kSlope = kBreak / std::pow((kBreak + kA) / (1 + kA), kG);
double SrgbToLinear(double v) { return v <= kBreak ? v / kSlope : std::pow((v + kA) / (1 + kA), kG); }
double LinearToSrgb(double v) { return v <= kBreak / kSlope ? v * kSlope : (1 + kA) * std::pow(v, 1 / kG) - kA; }
/// Printing density with black at code 95 and white at 685 (0.002 density a code, film gamma 0.6).
double CineonToLinear(double v) {
    const double black = std::pow(10.0, (95.0 - 685.0) / 300.0);
    return (std::pow(10.0, (v * 1023.0 - 685.0) / 300.0) - black) / (1 - black);
}

std::vector<Rgb> Greys(double (*f)(double) = [](double v) { return v; }) {
    std::vector<Rgb> out;
    for (double v : {0.0, 0.002, 0.04045, 0.1, 0.18, 0.5, 0.8, 1.0, 1.5}) out.push_back({f(v), f(v), f(v)});
    return out;
}

Texts Spaces(const std::string &from, const std::string &to) { return {{"FromSpace", from}, {"ToSpace", to}}; }

using Function = std::function<Rgb(const Rgb &)>;

double Clamp01(double v) { return std::clamp(v, 0.0, 1.0); }
// Tables clamp their input to the domain 0..1 they are written over.
Rgb Invert(const Rgb &c) { return {1 - Clamp01(c[0]), 1 - Clamp01(c[1]), 1 - Clamp01(c[2])}; }
Rgb Rotate(const Rgb &c) { return {Clamp01(c[2]), Clamp01(c[0]), Clamp01(c[1])}; }
Rgb Products(const Rgb &c) { return {c[0] * c[1], c[1] * c[2], c[2] * c[0]}; }

/// A .cube 3D table of `n` points a side (red fastest), or an .spi3d table (`spi`, each line with its indices).
std::string Table3D(const Function &f, int n, bool spi = false) {
    std::string t = spi ? "SPILUT 1.0\n3 3\n2 2 2\n" : "LUT_3D_SIZE " + std::to_string(n) + "\n";
    for (int i = 0; i < n * n * n; ++i) {
        const int r = spi ? i / (n * n) : i % n, g = i / n % n, b = spi ? i % n : i / (n * n);
        const Rgb o = f({r / (n - 1.0), g / (n - 1.0), b / (n - 1.0)});
        if (spi) t += std::to_string(r) + " " + std::to_string(g) + " " + std::to_string(b) + " ";
        t += std::to_string(o[0]) + " " + std::to_string(o[1]) + " " + std::to_string(o[2]) + "\n";
    }
    return t;
}

const char *const kInvertSpi1D = "Version 1\nFrom 0.0 1.0\nLength 2\nComponents 1\n{\n 1.0\n 0.0\n}\n";

TEST_F(ColorTools, ColorSpaceTransformCurvesByNameRoleAndAliasKeepTheFrameRulesAndRoundTrip) {
    // The tolerance covers the fast powers of the optimised transform.
    const std::tuple<const char *, const char *, double (*)(double)> cases[] = {
        {"sRGB", "Linear Rec.709", SrgbToLinear},
        {"srgb_texture", "scene_linear", SrgbToLinear},
        {"lin_rec709", "sRGB", LinearToSrgb},
        {"cineon", "linear", CineonToLinear}};
    for (const auto &[from, to, f] : cases) {
        SCOPED_TRACE(std::string(from) + " -> " + to);
        auto set = [from = from, to = to](Operator *op) {
            T::SetText(op, "FromSpace", from), T::SetText(op, "ToSpace", to);
        };
        auto model = [f = f](const Image &, const Px &p) { return Px{f(p[0]), f(p[1]), f(p[2]), p[3]}; };
        ExpectFrameRules("ColorSpaceTransform", set, model, 2e-5, {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16},
                         false); // it renders whole windows
    }
    // To linear and back through each encoding, from black up (below black the curves leave their use).
    const std::vector<Rgb> colours = {{0, 0.002, 0.04}, {0.18, 0.5, 0.8}, {1, 1.2, 1.5}};
    for (const char *space : {"sRGB", "Rec.709", "Cineon Log", "Linear Rec.2020"}) {
        Chain chain(ColourRow(colours));
        chain.Add("ColorSpaceTransform", Spaces(space, "scene_linear"));
        chain.Add("ColorSpaceTransform", Spaces("scene_linear", space));
        ExpectColoursNear(chain.Run(), colours, 1e-4);
    }
}

TEST_F(ColorTools, ColorSpaceTransformWhereConfigurationsAndTablesComeFromWhatCannotBeReadAndTheLoaderAndSaver) {
    // A configuration of our own: its space "squared" is the square of its reference.
    Write("own.ocio", "ocio_profile_version: 2\nroles: {default: ref}\ncolorspaces:\n"
                      "  - !<ColorSpace> {name: ref}\n"
                      "  - !<ColorSpace>\n    name: squared\n"
                      "    from_scene_reference: !<ExponentTransform> {value: 2}\n");
    Write("invert.cube", Table3D(Invert, 2)), Write("broken.cube", "LUT_3D_SIZE 2\n0 0 0\n1 1\n");
    Write("unknown.xyz", "0 1\n");
    const char *cst = "ColorSpaceTransform";
    auto lut = [&](const char *name) { return Texts{{"LUTFile", dir / name}}; };
    const std::tuple<const char *, const char *, const char *, Texts, double, std::string> cases[] = {
        // preference, environment, tool, its inputs: the grey 0.25 made `want`, or the console line
        {"own.ocio", nullptr, cst, Spaces("ref", "squared"), 0.0625, ""},
        {nullptr, "own.ocio", cst, Spaces("ref", "squared"), 0.0625, ""},
        {nullptr, nullptr, cst, Spaces("ref", "squared"), 0, "no colour space 'ref' in the configuration built-in"},
        {nullptr, nullptr, cst, Spaces("sRGB", ""), 0, "no colour space '' in the configuration built-in"},
        {"missing.ocio", nullptr, cst, Spaces("sRGB", "linear"), 0,
         "cannot read colour configuration '" + dir / "missing.ocio" + "'"},
        {nullptr, nullptr, "FileLUT", {}, 0.25, ""},                           // no file named yet
        {nullptr, nullptr, "FileLUT", {{"LUTFile", "invert.cube"}}, 0.75, ""}, // in the document's folder
        {nullptr, nullptr, "FileLUT", lut("missing.cube"), 0, "cannot read LUT file '" + dir / "missing.cube" + "'"},
        {nullptr, nullptr, "FileLUT", lut("broken.cube"), 0, "cannot read LUT file '" + dir / "broken.cube" + "'"},
        {nullptr, nullptr, "FileLUT", lut("unknown.xyz"), 0, "cannot read LUT file '" + dir / "unknown.xyz" + "'"},
    };
    for (const auto &[pref, env, cls, texts, want, line] : cases) {
        SCOPED_TRACE(std::string(cls) + " " + line);
        Chain chain(ColourRow({{0.25, 0.25, 0.25}}));
        chain.doc.SetFilePath(dir / "flow.orvane");
        if (pref) chain.doc.SetColorConfigPath(pref);
        if (env) setenv("OCIO", (dir / env).c_str(), 1);
        Operator *tool = chain.Add(cls, texts);
        Ref<Image> out = chain.Run();
        unsetenv("OCIO");
        if (line.empty())
            ExpectColoursNear(out, {{want, want, want}}, 1e-5);
        else
            ExpectFailure(out, chain.doc, tool->Name() + ": " + line);
    }
    // A float file of sRGB-encoded greys; the Loader takes them to scene_linear, or fails naming the space.
    const std::string file = dir / "greys.raw";
    std::string error;
    ASSERT_TRUE(Clip(file).PutFrameTagList(0, ColourRow(Greys()).Get(), {}, error)) << error;
    for (const char *space : {"srgb_texture", "Nowhere"}) {
        OrvaneDoc doc;
        Operator *loader = doc.AddTool(OvID("Loader"), "Plate");
        Set(doc, loader, {{"Clip", file}, {"GamutSpace", "ColorSpace"}, {"GamutColorSpace", space}});
        Ref<Image> out = T::EvalImage(loader);
        if (std::string(space) == "srgb_texture")
            ExpectColoursNear(out, Greys(SrgbToLinear), 1e-4);
        else
            ExpectFailure(out, doc, "Plate: no colour space 'Nowhere' in the configuration built-in");
    }
    // The Saver writes linear greys encoded for the role color_picking (sRGB).
    Chain chain(ColourRow(Greys()));
    std::filesystem::create_directory(dir / "out");
    Set(chain.doc, chain.Add("Saver"),
        {{"Clip", dir / "out/greys.0000.raw"}, {"GamutSpace", "ColorSpace"}, {"GamutColorSpace", "color_picking"}});
    ASSERT_TRUE(chain.Run()) << T::ConsoleText(chain.doc);
    const auto written = std::filesystem::directory_iterator(dir / "out")->path().string();
    ExpectColoursNear(Clip(written).GetFrameTagList(0, {}, error), Greys(LinearToSrgb), 2e-5);
}

TEST_F(ColorTools, FileLUTExactFunctionsAtEveryDepthInterpolationAndDirection) {
    const std::tuple<const char *, std::string, Function> cases[] = {
        {"invert.cube", Table3D(Invert, 2), Invert},
        {"rotate.cube", Table3D(Rotate, 5), Rotate},
        {"invert1d.cube", "LUT_1D_SIZE 2\n1 1 1\n0 0 0\n", Invert},
        {"invert.spi1d", kInvertSpi1D, Invert},
        {"rotate.spi3d", Table3D(Rotate, 2, true), Rotate}};
    for (const auto &[name, text, f] : cases) {
        const std::string file = Write(name, text);
        for (int depth : {DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
            SCOPED_TRACE(std::string(name) + " depth " + std::to_string(depth));
            Ref<Image> src = T::PatternImage(23, 7, depth, 3);
            Chain chain(src);
            chain.Add("FileLUT", {{"LUTFile", file}});
            Ref<Image> out = chain.Run();
            ASSERT_TRUE(out && out->Depth() == depth);
            // The function's value stored at the depth (integers and halves round once); alpha passes.
            Ref<Image> want = T::PatternImage(23, 7, depth, 3);
            for (int y = 0; y < 7; ++y)
                for (int x = 0; x < 23; ++x) {
                    const FltPixel in = src->GetFlt(x, y);
                    const Rgb w = f({in.R, in.G, in.B});
                    want->PutFlt(x, y, {float(w[0]), float(w[1]), float(w[2]), in.A});
                }
            EXPECT_LE(WorstDifference(*out, *want, want->DataWindow(), 4), depth == DepthRGBAFlt32 ? 1e-6 : 0.0);
        }
    }
    const std::string spi1d = Write("invert.spi1d", kInvertSpi1D), rotate = Write("rotate.cube", Table3D(Rotate, 9)),
                      products = Write("products.cube", Table3D(Products, 2));
    const std::tuple<std::string, int, bool, std::vector<Rgb>, double> reads[] = {
        // Products of channels from the cube's corners: trilinear gives the products; tetrahedral weighs the corners
        // on the path of the sorted coordinates (for 0.3, 0.7, 0: 000, 010, 110, 111 by 0.3, 0.4, 0.3, 0).
        {products, 1, false, {{0.21, 0, 0}, {0.055, 0.495, 0.09}}, 1e-6},
        {products, 2, false, {{0.3, 0, 0}, {0.1, 0.55, 0.1}}, 1e-6},
        // Inverting 1 - x gives 1 - x again; the inverse of the rotation is found by search.
        {spi1d, 1, true, {{0.7, 0.3, 1}, {0.9, 0.45, 0.1}}, 1e-5},
        {rotate, 1, true, {{0.7, 0.0, 0.3}, {0.55, 0.9, 0.1}}, 1e-3},
    };
    for (const auto &[file, interpolation, inverse, want, tol] : reads) {
        SCOPED_TRACE(file + " " + std::to_string(interpolation) + (inverse ? " inverse" : ""));
        Chain chain(ColourRow({{0.3, 0.7, 0.0}, {0.1, 0.55, 0.9}}));
        chain.Add("FileLUT", {{"LUTFile", file}}, {{"Interpolation", interpolation}, {"Direction", inverse}});
        ExpectColoursNear(chain.Run(), want, tol);
    }
}

TEST_F(ColorTools, ColorGainColorSpaceTransformAndFileLUTAgreeWithOiiotool) {
    if (!T::HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    // ColorGain as oiiotool's multiply, add, power and saturate, the lift keeping values above 0 (its power of a
    // negative is not a number); a smooth table with cross-talk, read by oiiotool with our configuration at hand.
    const std::string config = Write("builtin.ocio", ColorConfig::BuiltInText());
    auto look = [](const Rgb &c) {
        return Rgb{std::pow(c[0], 0.8) * 0.9 + 0.1 * c[1], 0.2 * c[0] + 0.8 * std::sqrt(c[1]), c[2] * c[2]};
    };
    const std::string cube = Write("look.cube", Table3D(look, 17));
    Numbers gain = {{"Gain", 1.1}, {"RedGain", 1.2}, {"GreenGain", 0.9}, {"Lift", 0.35}, {"Gamma", 1.25}};
    gain.insert(gain.end(), {{"RedGamma", 0.64}, {"GreenGamma", 1.28}, {"Saturation", 0.7}});
    const std::string gainArgs =
        "--mulc 1.32,0.99,1.1 --addc 0.35,0.35,0.35 --powc 1.25,0.625,0.8 --saturate 0.7 -d float";
    const std::tuple<const char *, Texts, Numbers, std::string, double> cases[] = {
        {"ColorGain", {}, gain, gainArgs, 2e-6},
        {"ColorSpaceTransform", Spaces("sRGB", "Linear Rec.2020"), {}, "--colorconvert sRGB \"Linear Rec.2020\"", 1e-5},
        {"FileLUT", {{"LUTFile", cube}}, {}, "--ociofiletransform " + cube, 1e-5}};
    Ref<Image> src = T::PatternImage(32, 16, DepthRGBAFlt32, 9);
    for (const auto &[cls, texts, numbers, args, tol] : cases) {
        Ref<Image> theirs = ThroughOiiotool(*src, dir.path, "--colorconfig " + config + " " + args);
        Chain chain(src);
        chain.Add(cls, texts, numbers);
        Ref<Image> ours = chain.Run();
        ASSERT_TRUE(theirs && ours) << cls;
        EXPECT_LT(WorstDifference(*ours, *theirs, ours->DataWindow()), tol) << cls;
    }
}

enum Gamut { Rec709, Rec2020, DCIP3, DisplayP3, AP0, AP1 };
enum Curve { Linear, SRGB, Rec709Curve, Gamma, Cineon };

Numbers Convert(Gamut from, Curve fromCurve, Gamut to, Curve toCurve) {
    return {{"SourceGamut", from}, {"SourceCurve", fromCurve}, {"OutputGamut", to}, {"OutputCurve", toCurve}};
}

Ref<Image> Through(const std::vector<Rgb> &colours, const std::vector<Numbers> &steps) {
    Chain chain(ColourRow(colours));
    for (const Numbers &settings : steps) chain.Add("GamutConvert", {}, settings);
    return chain.Run();
}

TEST_F(ColorTools, GamutConvertPublishedMatricesFrameRulesWhiteCurvesAndRoundTrips) {
    // BT.2087 (Rec.709 to Rec.2020, four places) and the ACES AP0 to AP1 matrix (ten places).
    const double bt2087[3][3] = {{0.6274, 0.3293, 0.0433}, {0.0691, 0.9195, 0.0114}, {0.0164, 0.0880, 0.8956}};
    const double ap0ToAp1[3][3] = {{1.4514393161, -0.2365107469, -0.2149285693},
                                   {-0.0765537734, 1.1762296998, -0.0996759264},
                                   {0.0083161484, -0.0060324498, 0.9977163014}};
    const std::tuple<Gamut, Gamut, const double(*)[3], double> cases[] = {{Rec709, Rec2020, bt2087, 1e-4},
                                                                          {AP0, AP1, ap0ToAp1, 2e-6}};
    for (const auto &[from, to, m, tol] : cases) {
        auto set = [from = from, to = to](Operator *op) { T::SetNumbers(op, Convert(from, Linear, to, Linear)); };
        auto model = [m = m](const Image &, const Px &p) {
            Px w{0, 0, 0, p[3]};
            for (int r = 0; r < 3; ++r) w[r] = m[r][0] * p[0] + m[r][1] * p[1] + m[r][2] * p[2];
            return w;
        };
        ExpectFrameRules("GamutConvert", set, model, tol);
    }
    // The whites are adapted, so equal RGB stays equal RGB from any gamut to any other.
    const std::vector<Rgb> greys = {{1, 1, 1}, {0.18, 0.18, 0.18}};
    for (int from = Rec709; from <= AP1; ++from)
        for (int to = Rec709; to <= AP1; ++to) {
            SCOPED_TRACE(std::to_string(from) + " -> " + std::to_string(to));
            ExpectColoursNear(Through(greys, {Convert(Gamut(from), Linear, Gamut(to), Linear)}), greys, 2e-6);
        }
    ExpectColoursNear(Through({{0.02, 0.5, 1}}, {Convert(Rec709, SRGB, Rec709, Linear)}),
                      {{SrgbToLinear(0.02), SrgbToLinear(0.5), 1}}, 2e-5);
    ExpectColoursNear(Through({{0.5, 0.25, 1}}, {Convert(Rec709, Gamma, Rec709, Linear)}), // the default gamma, 2.2
                      {{std::pow(0.5, 2.2), std::pow(0.25, 2.2), 1}}, 2e-5);
    const std::tuple<Gamut, Curve, Gamut, Curve> trips[] = {{Rec709, SRGB, AP1, Cineon},
                                                            {DisplayP3, Rec709Curve, Rec2020, Gamma},
                                                            {DCIP3, Gamma, AP0, Linear},
                                                            {Rec2020, Cineon, Rec709, SRGB}};
    // Colours well inside every gamut, so that no step clamps.
    const std::vector<Rgb> colours = {{0.5, 0.5, 0.5}, {0.4, 0.5, 0.45}, {0.2, 0.3, 0.25}};
    for (const auto &[a, ac, b, bc] : trips)
        ExpectColoursNear(Through(colours, {Convert(a, ac, b, bc), Convert(b, bc, a, ac)}), colours, 1e-4);
}

} // namespace Orvane::colortoolstest
