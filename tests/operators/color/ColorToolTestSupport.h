#pragma once
// Shared by the small colour tools' tests: a tool fed an image, exact read-back, per-pixel models, the frame rules.
#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <functional>
#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::colortest {

using Test::AddImageSource, Test::ConsoleText, Test::PatternImage, Test::WindowedImage;
using Px = std::array<double, 4>;
using PixelModel = std::function<Px(const Px &)>; ///< the tool's function of one pixel, in double
using Setter = std::function<void(Operator *)>;
using Setting = std::pair<Setter, PixelModel>; ///< a row of a frame table: a tool's setting, its effect on a pixel
inline const std::vector<int> kEveryDepth = {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8};
inline const PixelModel kIdentity = [](const Px &p) { return p; };
inline constexpr FltPixel kFrameCanvas{0.2f, 0.4f, 0.6f, 0.8f}; ///< the canvas colour of ExpectFrame's input
struct ColorTool : ::testing::Test {
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};
/// A document with an image source feeding the main input of a tool of class `classId`.
struct Rig {
    OrvaneDoc doc;
    Test::ImageSourceTool *source;
    Operator *tool;
    Rig(const char *classId, Ref<Image> img)
        : source(Test::AddImageSource(doc, "Src", std::move(img))), tool(doc.AddTool(OvID(classId))) {
        EXPECT_TRUE(tool && tool->FindMainInput()->ConnectTo(source->FindMainOutput()));
    }
};
/// Renders a tool's main output without the result cache.
inline Ref<Image> Render(Operator *op, const ImgRectI *roi = nullptr, uint32_t flags = 0) {
    RenderTask task;
    EvalOptions opt;
    opt.flags = flags, opt.task = &task, opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    return Test::EvalImage(op, 0.0, opt);
}
/// `img` through a chain of tools, each of a class and set by its setter, rendered over `roi` or all of it.
inline Ref<Image> Through(Ref<Image> img, const std::vector<std::pair<const char *, Setter>> &tools,
                          const ImgRectI *roi = nullptr) {
    OrvaneDoc doc;
    Operator *last = Test::AddImageSource(doc, "Src", std::move(img));
    for (const auto &[classId, set] : tools) {
        Operator *next = doc.AddTool(OvID(classId));
        EXPECT_TRUE(next && next->FindMainInput()->ConnectTo(last->FindMainOutput()));
        set(last = next);
    }
    return Render(last, roi);
}
inline Px ToPx(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }
inline Setter Numbers(const std::vector<std::pair<const char *, double>> &values) {
    return [values](Operator *op) { Test::SetNumbers(op, values); };
}
/// The pixel at (x, y) read exactly (integers over 255 or 65535, a mask's value in each channel), canvas beyond.
inline Px PxAt(const Image &img, int x, int y) {
    if (!img.DataWindow().Contains(x, y)) return ToPx(img.GetCanvasColor());
    if (img.IsFloat()) return ToPx(img.GetFlt(x, y));
    const int i = (x - img.DataWindow().x0) * (img.IsMask() ? 1 : 4), s = img.IsMask() ? 0 : 1;
    const bool b = FormatOfDepth(img.Depth()).bytesPerComponent == 1;
    Px p;
    for (int c = 0; c < 4; ++c)
        p[c] = b ? img.Row<uint8_t>(y)[i + c * s] / 255.0 : img.Row<uint16_t>(y)[i + c * s] / 65535.0;
    return p;
}
/// Expects the stored pixel `got` to be the exact result `e` as `depth` holds it: clamped to 0..1 and within half a
/// step on integers, within half an ulp on floats; plus `slack` relative (tools that work in float on integer data).
inline void ExpectPx(int depth, const Px &got, const Px &e, double slack, const std::string &where) {
    const PixelFormat f = FormatOfDepth(depth);
    for (int c = 0; c < 4; ++c) {
        const double want = f.isFloat ? e[c] : std::clamp(e[c], 0.0, 1.0);
        const double tol = !f.isFloat                 ? 0.5 / (f.bytesPerComponent == 1 ? 255 : 65535) + 1e-11
                           : f.bytesPerComponent == 2 ? std::fabs(want) / 2048 + 3e-8
                                                      : std::fabs(want) * 6e-8 + 1e-37;
        ASSERT_NEAR(got[c], want, tol + slack * (1 + std::fabs(want))) << where << " channel " << c;
    }
}
/// Expects every pixel of `out` to be `model` of `in`'s pixel (beyond `in`'s data window: of its canvas colour).
inline void ExpectModel(const PixelModel &model, const Image &in, const Image &out, const std::string &what,
                        double slack = 0) {
    const ImgRectI dw = out.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x)
            ExpectPx(out.Depth(), PxAt(out, x, y), model(PxAt(in, x, y)), slack,
                     what + " at " + std::to_string(x) + "," + std::to_string(y));
}
/// Expects `a` to hold `b`'s bytes over `r`.
inline void ExpectSameBits(const Image &a, const Image &b, const ImgRectI &r) {
    for (int y = r.y0; y < r.y1; ++y)
        ASSERT_EQ(0, std::memcmp(a.PixelAddress(r.x0, y), b.PixelAddress(r.x0, y), r.Width() * a.BytesPerPixel())) << y;
}
/// Each setting at each depth over a 48 x 32 frame whose data window leaves kFrameCanvas on every side, under each
/// clipping mode: pre-calculation gives windows and canvas without pixels; the canvas goes through the model (clipped,
/// the input's stays unless `setsCanvas`); every pixel follows the model; regions crop the whole; one worker = many.
inline void ExpectFrame(const char *classId, const std::vector<Setting> &settings, double slack = 0,
                        const std::vector<int> &depths = kEveryDepth, bool setsCanvas = false) {
    const ImgRectI inWindow(8, 4, 40, 28);
    for (size_t i = 0; i < settings.size(); ++i)
        for (int depth : depths)
            for (const char *mode : {"ClippingMode_None", "ClippingMode_Domain", "ClippingMode_Frame"}) {
                SCOPED_TRACE("setting " + std::to_string(i) + " depth " + std::to_string(depth) + " " + mode);
                const bool clipped = std::string(mode) != "ClippingMode_None";
                const ImgRectI window = std::string(mode) == "ClippingMode_Frame" ? ImgRectI(0, 0, 48, 32) : inWindow;
                Ref<Image> src = Test::WindowedImage(48, 32, inWindow, kFrameCanvas, 3, depth);
                Rig rig(classId, src);
                settings[i].first(rig.tool);
                Test::SetID(rig.tool, "ClippingMode", mode);
                Ref<Image> shape = Render(rig.tool, nullptr, ReqFlagPreCalc);
                EXPECT_EQ(rig.source->processCount, 0) << "pre-calculation asked the source for pixels";
                Ref<Image> out = Render(rig.tool);
                ASSERT_TRUE(shape && shape->IsNoData() && !shape->HasScanLineData() && shape->DataWindow() == window &&
                            out && out->DataWindow() == window && shape->GetCanvasColor() == out->GetCanvasColor());
                const Px canvas = ToPx(kFrameCanvas); // the canvas colour is kept in float: within 1e-6 relative
                ExpectPx(DepthRGBAFlt32, ToPx(out->GetCanvasColor()),
                         clipped && !setsCanvas ? canvas : settings[i].second(canvas), 9.4e-7, "canvas");
                ExpectModel(settings[i].second, *src, *out, classId, slack);
                const int before = WorkerCount();
                for (const ImgRectI &roi : {ImgRectI(5, 7, 30, 20), ImgRectI(38, 25, 60, 40), ImgRectI(0, 0, 48, 32)}) {
                    SetWorkerCount(roi.x0 == 0 ? 1 : before); // the whole frame by one worker
                    Ref<Image> part = Render(rig.tool, &roi);
                    SetWorkerCount(before);
                    ASSERT_TRUE(part && part->DataWindow() == (window & roi) && part->ValidWindow() == (window & roi));
                    ExpectSameBits(*part, *out, window & roi);
                }
            }
}

} // namespace Orvane::colortest
