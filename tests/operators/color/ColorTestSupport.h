#pragma once
// What the tests of the colour tools share: a chain of tools after an image source rendered without the cache, rows
// of known colours, oiiotool's result for the same image, a model compared on every depth, and the rules of the
// processing frame that every per-pixel tool keeps.
#include <fstream>
#include <functional>

#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::colortest {
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
        RenderTask own;
        RenderTask &t = task ? *task : own;
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

/// The largest difference of the first `channels` channels of `a` from `b` over `r` (absolute, or relative to `b`
/// above 1).
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

/// The rules of the frame for tool `cls` (`set` makes its settings) at each of `depths`, with `model` the expected
/// colour of an input colour (a mask: its value in every channel): float32 within `tol`, float16 within 1.5e-3
/// (relative above 1), integers the nearest stored value within float rounding of the half-way points or within
/// `tol`. Under each clipping mode: the data window, the canvas colour (processed, or kept under Domain and Frame),
/// the processed canvas beyond the input's window, pre-calculation windows without pixels, regions of interest that
/// are the same values as the whole frame (the source giving only the region asked for; the result cut to the region
/// unless `cropsToRegion` is false), and the same values with one worker or many.
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
            auto expected = [&](FltPixel p) {
                if (mask) p.R = p.G = p.B = p.A;
                return model(*src, ToPx(p));
            };
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
            ASSERT_TRUE(one && one.Get() != out.Get());
            EXPECT_EQ(WorstDifference(*one, *out, window, 4), 0);
        }
}

/// The fixture of the colour tool tests: the tools loaded once, and a folder for files.
class ToolTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { T::LoadOperators(); }
    std::string Write(const std::string &name, const std::string &text) {
        std::ofstream(dir / name) << text;
        return dir / name;
    }
    T::TempDir dir;
};

} // namespace Orvane::colortest
