// The three keyers rendered through the engine: every output pixel against
// the models of KeyModels.h (the canvas beyond the source's window keyed as
// well), at every depth; the refining chain's stage order against the host's
// matte steps run in that order; spill and fringe against their formulas;
// rows against the device kernels on OpenCL.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <map>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/image/NewImage.h"
#include "host/matte/MatteSteps.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/color/ColorToolTestSupport.h"
#include "tests/operators/key/KeyModels.h"

namespace Orvane {
namespace {

using namespace keytest;
namespace Support = Orvane::Test;
using colortest::ColorTool, colortest::Px, colortest::PxAt, colortest::Render, colortest::Rig;

using KeyerTool = ColorTool;
using KeyerDevice = ColorTool;

constexpr FltPixel kCanvas{0.3f, 0.7f, 0.2f, 1.f};
const ImgRectI kFrame(0, 0, 48, 32), kWindow(8, 4, 40, 28);

Rgb RgbOf(const Px &p) { return {p[0], p[1], p[2]}; }

/// The test pattern over `window` of the frame, kCanvas beyond; an empty
/// window gives a frame of canvas alone.
Ref<Image> Plate(const ImgRectI &window, unsigned seed, int depth) {
    if (!window.IsNull()) return Support::WindowedImage(48, 32, window, kCanvas, seed, depth);
    const ImgRectI none;
    return NewImageTagList(
        {{ImgWidth, 48}, {ImgHeight, 32}, {ImgDepth, depth}, {ImgDataWindow, &none}, {ImgCanvasColor, &kCanvas}});
}

/// The largest step of alpha a depth stores, and the rounding of colour.
double StoreStep(int depth) {
    switch (depth) {
    case DepthRGBAInt8: return 0.5 / 255;
    case DepthRGBAInt16: return 0.5 / 65535;
    case DepthRGBAFlt16: return 1.0 / 2048;
    default: return 1e-6;
    }
}

/// Expects every pixel of `out` over the frame to keep `src`'s colour (its
/// canvas beyond its window) and carry alpha(colour), within `tol` plus the
/// depth's rounding; pixels `skip` says are on a hard edge are left out.
template <class Alpha, class Skip>
void ExpectKey(const Image &src, const Image &out, const Alpha &alpha, double tol, const Skip &skip) {
    ASSERT_EQ(out.DataWindow(), kFrame);
    EXPECT_EQ(out.GetCanvasColor(), src.GetCanvasColor());
    const double step = StoreStep(out.Depth());
    for (int y = kFrame.y0; y < kFrame.y1; ++y)
        for (int x = kFrame.x0; x < kFrame.x1; ++x) {
            const Px in = PxAt(src, x, y), got = PxAt(out, x, y);
            const std::string at = std::to_string(x) + "," + std::to_string(y);
            // Beyond the source's window the canvas colour, stored at the depth.
            const double colourTol = src.DataWindow().Contains(x, y) ? 1e-7 : 2 * step;
            for (int c = 0; c < 3; ++c)
                ASSERT_NEAR(got[c], in[c], colourTol * (1 + std::fabs(in[c]))) << "colour at " << at;
            if (skip(in)) continue;
            const double want = alpha(in, x, y);
            ASSERT_NEAR(got[3], want, tol + step * (1 + std::fabs(want))) << "alpha at " << at;
        }
}

const auto kNoSkip = [](const Px &) { return false; };

TEST_F(KeyerTool, ChromaKeyerFollowsTheBoxAtEveryDepth) {
    struct Case {
        const char *name;
        ChromaKeyRanges k;
        bool solid; ///< the ranges at their defaults: nothing keyed
    };
    const Case cases[] = {
        {"chroma axes, soft", Ranges(0, {0.3f, 0.45f, 0.2f, 0.1f}, {0.6f, 0.9f, 0.55f, 0.8f}, 0.1f), false},
        {"plain colour, soft", Ranges(1, {0.1f, 0.2f, 0.f, 0.f}, {0.9f, 1.2f, 0.6f, 1.f}, 0.25f), false},
        {"plain colour, hard", Ranges(1, {0.1f, 0.2f, 0.f, 0.f}, {0.9f, 1.2f, 0.6f, 1.f}, 0.f), false},
        {"defaults", ChromaKeyRanges{}, true},
    };
    static const char *const lows[4] = {"RedLow", "GreenLow", "BlueLow", "LuminanceLow"};
    static const char *const highs[4] = {"RedHigh", "GreenHigh", "BlueHigh", "LuminanceHigh"};
    for (const Case &c : cases)
        for (int depth : colortest::kEveryDepth) {
            SCOPED_TRACE(std::string(c.name) + " depth " + std::to_string(depth));
            Ref<Image> src = Support::WindowedImage(48, 32, kWindow, kCanvas, 5, depth);
            Rig rig("ChromaKeyer", src);
            Support::SetNumber(rig.tool, "KeyType", c.k.keyType);
            Support::SetNumber(rig.tool, "SoftRange", c.k.soft);
            Support::SetNumber(rig.tool, "SpillSuppression", 0.0);
            for (int i = 0; i < 4; ++i) {
                Support::SetNumber(rig.tool, lows[i], c.k.low[i]);
                Support::SetNumber(rig.tool, highs[i], c.k.high[i]);
            }
            Ref<Image> out = Render(rig.tool);
            ASSERT_TRUE(out);
            // Integer axes are truncated to steps (three at most), which the
            // soft range divides.
            const bool integer = !FormatOfDepth(depth).isFloat;
            const double tol = integer && c.k.soft > 0 ? (1.0 + 4.0 / c.k.soft) / 65535 : 2e-6;
            const ChromaKeyRanges k = c.k;
            ExpectKey(
                *src, *out, [&](const Px &p, int, int) { return c.solid ? 1.0 : ChromaModel(k, RgbOf(p)); }, tol,
                [&](const Px &p) { return !c.solid && k.soft == 0.f && ChromaEdgeDistance(k, RgbOf(p)) < 1e-4; });
        }
}

TEST_F(KeyerTool, ChromaKeyerSpillAndFringeFollowTheirFormulas) {
    const ChromaKeyRanges k = Ranges(1, {0.f, 0.4f, 0.f, 0.f}, {0.5f, 1.5f, 0.5f, 1.f}, 0.3f);
    Ref<Image> src = Support::WindowedImage(48, 32, kFrame, kCanvas, 7, DepthRGBAFlt32);
    struct Case {
        double spill;
        int method;     ///< SpillMethod's index: 0 None .. 4 Burnt
        int spillColor; ///< 0 red, 1 green, 2 blue
        double shape, shift[3];
    };
    const Case cases[] = {
        {1.0, 3, 1, 1.0, {0, 0, 0}},         // Well Done: green held to min(red, blue)
        {0.5, 2, 1, 1.0, {0, 0, 0}},         // Medium, half the spill
        {1.0, 4, 2, 1.0, {0, 0, 0}},         // Burnt, on blue
        {1.0, 0, 0, 1.0, {0, 0, 0}},         // None uses the gentlest limit
        {0.0, 1, 1, 1.3, {0.4, -0.2, 0.1}},  // fringe only
        {0.8, 1, 1, 0.7, {-0.3, 0.0, 0.25}}, // Rare, then the fringe
    };
    for (const Case &c : cases) {
        SCOPED_TRACE("method " + std::to_string(c.method) + " shape " + std::to_string(c.shape));
        Rig rig("ChromaKeyer", src);
        Support::SetNumbers(rig.tool, {{"KeyType", 1},
                                       {"GreenLow", 0.4},
                                       {"GreenHigh", 1.5},
                                       {"RedHigh", 0.5},
                                       {"BlueHigh", 0.5},
                                       {"SoftRange", 0.3},
                                       {"SpillSuppression", c.spill},
                                       {"SpillMethod", c.method},
                                       {"SpillColor", c.spillColor},
                                       {"FringeShape", c.shape},
                                       {"RedCyan", c.shift[0]},
                                       {"GreenMagenta", c.shift[1]},
                                       {"BlueYellow", c.shift[2]}});
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out);
        for (int y = 0; y < 32; ++y)
            for (int x = 0; x < 48; ++x) {
                const Px in = PxAt(*src, x, y), got = PxAt(*out, x, y);
                const double a = ChromaModel(k, RgbOf(in));
                Px want = in;
                want[3] = a;
                if (c.spill > 0) {
                    // The spill channel against the other two.
                    const int key = c.spillColor, o1 = (key + 1) % 3, o2 = (key + 2) % 3;
                    const double p = want[o1], q = want[o2];
                    const double limits[4] = {std::max(p, q), (p + q) / 2, std::min(p, q),
                                              std::max(0.0, (3 * std::min(p, q) - std::max(p, q)) / 2)};
                    const double limit = limits[std::max(c.method - 1, 0)];
                    want[key] = std::max(0.0, want[key] - c.spill * std::max(0.0, want[key] - limit));
                }
                const double w = 4 * a * (1 - a);
                for (int ch = 0; ch < 3; ++ch) want[ch] = want[ch] * (1 + w * (c.shape - 1)) + w * c.shift[ch] * 0.5;
                for (int ch = 0; ch < 4; ++ch)
                    ASSERT_NEAR(got[ch], want[ch], 2e-5) << "channel " << ch << " at " << x << "," << y;
            }
    }
}

TEST_F(KeyerTool, LumaKeyerChannelsDepthAndEqualLimits) {
    struct Case {
        int channel;
        double low, high;
        int depth;
    };
    const Case cases[] = {
        {0, 0.2, 0.7, DepthRGBAFlt32}, {1, 0.2, 0.7, DepthRGBAFlt32},   {2, 0.2, 0.7, DepthRGBAFlt32},
        {3, 0.2, 0.7, DepthRGBAFlt32}, {4, 0.2, 0.7, DepthRGBAFlt32},   {5, 0.1, 0.6, DepthRGBAFlt32},
        {6, 0.3, 0.8, DepthRGBAFlt32}, {7, 0.25, 0.75, DepthRGBAFlt32}, {4, 0.5, 0.5, DepthRGBAFlt32},
        {4, 0.2, 0.7, DepthRGBAInt16}, {5, 0.1, 0.6, DepthRGBAInt16},   {7, 0.25, 0.75, DepthRGBAInt16},
        {2, 0.2, 0.7, DepthRGBAInt8},  {4, 0.2, 0.7, DepthRGBAFlt16},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE("channel " + std::to_string(c.channel) + " depth " + std::to_string(c.depth));
        Ref<Image> src = Support::WindowedImage(48, 32, kWindow, kCanvas, 9, c.depth);
        // Depth: a ramp over the window in the Z channel.
        ASSERT_TRUE(src->AddAuxChannel(AuxChannelKind::Z));
        for (int y = kWindow.y0; y < kWindow.y1; ++y)
            for (int x = kWindow.x0; x < kWindow.x1; ++x)
                src->AuxRow(AuxChannelKind::Z, y)[x - kWindow.x0] = 0.03f * (x - kWindow.x0) - 0.1f;
        Rig rig("LumaKeyer", src);
        Support::SetNumbers(rig.tool, {{"Channel", c.channel}, {"Low", c.low}, {"High", c.high}});
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out);
        auto value = [&](const Px &p, int x, int y) {
            const Rgb rgb = RgbOf(p);
            switch (c.channel) {
            case 0: return p[2];
            case 1: return p[1];
            case 2: return p[0];
            case 3: return p[3];
            case 5: return SaturationModel(rgb);
            case 6: return HueModel(rgb);
            case 7: return kWindow.Contains(x, y) ? 0.03 * (x - kWindow.x0) - 0.1 : 0.0;
            default: return Luma(rgb);
            }
        };
        // Integer forms: the value to a step, which the ramp widens.
        const double tol = FormatOfDepth(c.depth).isFloat ? 2e-6 : 1.5 / 65535 / (c.high - c.low);
        ExpectKey(
            *src, *out, [&](const Px &p, int x, int y) { return RampModel(value(p, x, y), c.low, c.high); }, tol,
            // A hard step: values within rounding of the limit may fall either side.
            [&](const Px &p) { return c.low == c.high && std::fabs(value(p, 0, 0) - c.low) < 1e-5; });
    }
}

TEST_F(KeyerTool, DifferenceKeyerAgainstForegroundOrCanvas) {
    struct Case {
        const char *name;
        int bgDepth;
        ImgRectI bgWindow;
        int fgDepth; ///< 0: no Foreground
        ImgRectI fgWindow;
        double low, high;
    };
    const Case cases[] = {
        {"no foreground", DepthRGBAFlt32, kWindow, 0, {}, 0.0, 0.4},
        {"empty frame", DepthRGBAFlt32, ImgRectI(), 0, {}, 0.0, 0.02},
        {"foreground of another window and depth", DepthRGBAFlt32, kWindow, DepthRGBAFlt16, ImgRectI(0, 10, 30, 32),
         0.1, 0.6},
        {"16-bit", DepthRGBAInt16, kWindow, DepthRGBAInt16, kFrame, 0.1, 0.6},
        {"8-bit against float", DepthRGBAInt8, kFrame, DepthRGBAFlt32, kWindow, 0.05, 0.5},
    };
    const FltPixel fgCanvas{0.9f, 0.1f, 0.4f, 1.f};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<Image> bg = Plate(c.bgWindow, 11, c.bgDepth);
        Rig rig("DifferenceKeyer", bg);
        Ref<Image> fg;
        if (c.fgDepth) {
            fg = Support::WindowedImage(48, 32, c.fgWindow, fgCanvas, 12, c.fgDepth);
            Operator *fgSource = Support::AddImageSource(rig.doc, "Fg", fg);
            ASSERT_TRUE(rig.tool->FindInput("Foreground")->ConnectTo(fgSource->FindMainOutput()));
        }
        Support::SetNumbers(rig.tool, {{"Low", c.low}, {"High", c.high}});
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out);
        // Two integer images: D to a step, which the ramp widens.
        const bool integer = !FormatOfDepth(c.bgDepth).isFloat && c.fgDepth && !FormatOfDepth(c.fgDepth).isFloat;
        const double tol = integer ? 1.5 / 65535 / (c.high - c.low) : 2e-6;
        ExpectKey(
            *bg, *out,
            [&](const Px &b, int x, int y) {
                const Px f = fg ? PxAt(*fg, x, y) : colortest::ToPx(kCanvas);
                const double d = std::max({std::fabs(f[0] - b[0]), std::fabs(f[1] - b[1]), std::fabs(f[2] - b[2])});
                return RampModel(d, c.low, c.high);
            },
            tol, kNoSkip);
    }
    // An empty frame without a Foreground is clear everywhere.
    Rig rig("DifferenceKeyer", Plate(ImgRectI(), 11, DepthRGBAFlt32));
    Ref<Image> out = Render(rig.tool);
    ASSERT_TRUE(out);
    for (int y = 0; y < 32; ++y)
        for (int x = 0; x < 48; ++x) ASSERT_EQ(out->GetFlt(x, y).A, 0.f);
}

/// A one-channel mask over the frame: a ramp across, varying down.
Ref<Image> MaskImage(unsigned salt) {
    Ref<Image> m = NewImageTagList({{ImgWidth, 48}, {ImgHeight, 32}, {ImgDepth, DepthAFlt32}});
    EXPECT_TRUE(m && m->AllocScanLineData());
    for (int y = 0; y < 32; ++y)
        for (int x = 0; x < 48; ++x) {
            const float v = std::fmod(0.021f * x + 0.037f * y + 0.13f * salt, 1.f);
            m->PutFlt(x, y, {v, v, v, v});
        }
    return m;
}

TEST_F(KeyerTool, ChainRunsBlurLevelsInvertMasksPostMultiplyInThatOrder) {
    Ref<Image> src = Support::WindowedImage(48, 32, kFrame, kCanvas, 13, DepthRGBAFlt32);
    Ref<Image> solid = MaskImage(1), garbage = MaskImage(2);
    Rig rig("LumaKeyer", src);
    Operator *solidSource = Support::AddImageSource(rig.doc, "SolidMask", solid);
    Operator *garbageSource = Support::AddImageSource(rig.doc, "GarbageMask", garbage);
    ASSERT_TRUE(rig.tool->FindInput("Solid.Mask")->ConnectTo(solidSource->FindMainOutput()));
    ASSERT_TRUE(rig.tool->FindInput("Garbage.Mask")->ConnectTo(garbageSource->FindMainOutput()));
    Support::SetID(rig.tool, "Filter", "Bartlett");
    Support::SetNumbers(rig.tool, {{"Channel", 2},
                                   {"Low", 0.1},
                                   {"High", 0.9},
                                   {"MatteBlur", 2.5},
                                   {"MatteContrast", -0.3},
                                   {"MatteGamma", 1.7},
                                   {"Invert", 1},
                                   {"Garbage.MaskInverted", 1},
                                   {"PostMultiplyImage", 1}});
    Ref<Image> out = Render(rig.tool);
    ASSERT_TRUE(out);

    // The first matte from the model, then the host's steps in the chain's order.
    Ref<Image> want = CopyOfImage(src.Get());
    for (int y = 0; y < 32; ++y)
        for (int x = 0; x < 48; ++x) {
            FltPixel p = src->GetFlt(x, y);
            p.A = static_cast<float>(RampModel(p.R, 0.1, 0.9));
            want->PutFlt(x, y, p);
        }
    FltPixel canvas = kCanvas;
    canvas.A = static_cast<float>(RampModel(canvas.R, 0.1, 0.9));
    want->SetCanvasColor(canvas);
    ASSERT_TRUE(MatteCore_DoMultiBox(nullptr, want.Get(), MatteAlpha, 2.5, 2));
    ASSERT_TRUE(DoLevelsFlt(nullptr, want.Get(), {{MatteLevelsContrast, -0.3}, {MatteLevelsGamma, 1.7}}));
    ASSERT_TRUE(MatteCore_DoInvert(nullptr, want.Get()));
    want = DoGarbageMatte(nullptr, want.Get(), solid.Get(), GarbageMatteSolid, false, false);
    ASSERT_TRUE(want);
    want = DoGarbageMatte(nullptr, want.Get(), garbage.Get(), GarbageMatteGarbage, false, true);
    ASSERT_TRUE(want && MatteCore_DoPostMultiply(nullptr, want.Get()));
    ASSERT_EQ(out->DataWindow(), want->DataWindow());
    for (int y = 0; y < 32; ++y)
        for (int x = 0; x < 48; ++x)
            Support::ExpectPixelNear(out->GetFlt(x, y), want->GetFlt(x, y), 1e-5,
                                     std::to_string(x) + "," + std::to_string(y));
    EXPECT_EQ(out->GetCanvasColor(), kCanvas) << "the source's canvas";
}

TEST_F(KeyerTool, RegionsReadPastThemselvesForTheBlurAndAMissingInputGivesNothing) {
    Ref<Image> src = Support::WindowedImage(48, 32, kFrame, kCanvas, 17, DepthRGBAFlt32);
    Rig rig("LumaKeyer", src);
    Support::SetNumbers(rig.tool, {{"Channel", 4}, {"Low", 0.2}, {"High", 0.8}, {"MatteBlur", 3}});
    Ref<Image> whole = Render(rig.tool);
    const ImgRectI roi(10, 6, 30, 20);
    Ref<Image> part = Render(rig.tool, &roi);
    ASSERT_TRUE(whole && part);
    EXPECT_TRUE((part->DataWindow() & roi) == roi);
    for (int y = roi.y0; y < roi.y1; ++y)
        for (int x = roi.x0; x < roi.x1; ++x)
            Support::ExpectPixelNear(part->GetFlt(x, y), whole->GetFlt(x, y), 1e-6,
                                     std::to_string(x) + "," + std::to_string(y));

    OrvaneDoc doc;
    for (const char *id : {"ChromaKeyer", "LumaKeyer", "DifferenceKeyer"}) {
        Operator *tool = doc.AddTool(OvID(id));
        ASSERT_TRUE(tool) << id;
        EXPECT_FALSE(Render(tool)) << id << " without an input";
    }
}

TEST_F(KeyerDevice, KernelsMatchTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    struct Case {
        const char *tool;
        std::vector<std::pair<const char *, double>> values;
        bool soft; ///< integer rows and the float kernel agree only off hard edges
    };
    const Case cases[] = {
        {"ChromaKeyer",
         {{"GreenLow", 0.45}, {"GreenHigh", 0.9}, {"RedHigh", 0.6}, {"SoftRange", 0.1}, {"SpillSuppression", 0}},
         true},
        {"ChromaKeyer", {{"KeyType", 1}, {"GreenLow", 0.3}, {"BlueHigh", 0.5}, {"SpillSuppression", 0}}, false},
        {"LumaKeyer", {{"Channel", 4}, {"Low", 0.2}, {"High", 0.8}}, true},
        {"LumaKeyer", {{"Channel", 6}, {"Low", 0.1}, {"High", 0.9}}, true},
        {"LumaKeyer", {{"Channel", 5}, {"Low", 0.4}, {"High", 0.4}}, false},
        {"DifferenceKeyer", {{"Low", 0.05}, {"High", 0.5}}, true},
    };
    const std::map<int, double> tolerance = {{DepthRGBAFlt32, 1e-6},
                                             {DepthRGBAFlt16, 1e-3},
                                             {DepthRGBAInt16, 41.0 / 65535},
                                             {DepthRGBAInt8, 1.01 / 255 + 41.0 / 65535}};
    for (const Case &c : cases)
        for (const auto &[depth, tol] : tolerance) {
            if (!c.soft && !FormatOfDepth(depth).isFloat) continue;
            SCOPED_TRACE(std::string(c.tool) + " " + std::to_string(c.values.size()) + " depth " +
                         std::to_string(depth));
            Rig rig(c.tool, Support::WindowedImage(48, 32, kWindow, kCanvas, 19, depth));
            if (std::string(c.tool) == "DifferenceKeyer") { // a Foreground over the whole output
                Operator *fg =
                    Support::AddImageSource(rig.doc, "Fg", Support::WindowedImage(48, 32, kFrame, kCanvas, 20, depth));
                ASSERT_TRUE(rig.tool->FindInput("Foreground")->ConnectTo(fg->FindMainOutput()));
            }
            Support::SetNumbers(rig.tool, c.values);
            Ref<Image> cpu = Render(rig.tool);
            const int launches = ctx->LaunchCount();
            RenderTask task;
            task.SetDevice(ctx);
            EvalOptions opt;
            opt.task = &task, opt.useCache = false;
            Ref<Image> dev = Support::EvalImage(rig.tool, 0.0, opt);
            ASSERT_TRUE(cpu && dev);
            EXPECT_GT(ctx->LaunchCount(), launches) << "the kernel ran";
            EXPECT_TRUE(task.DeviceLog().empty()) << task.DeviceLog().front();
            ASSERT_EQ(cpu->DataWindow(), dev->DataWindow());
            for (int y = 0; y < 32; ++y)
                for (int x = 0; x < 48; ++x)
                    Support::ExpectPixelNear(dev->GetFlt(x, y), cpu->GetFlt(x, y), tol,
                                             std::to_string(x) + "," + std::to_string(y));
        }
}

} // namespace
} // namespace Orvane
