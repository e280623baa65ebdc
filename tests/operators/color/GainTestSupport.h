#pragma once
// What the tests of the gain tools share: a document with a source and the tool, renders without the cache, the
// comparison with a model on every depth, and one check of the processing frame that every per-pixel tool keeps.
#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <functional>
#include <string>
#include <utility>

#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "host/flow/Engine.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::gaintest {

using Px = std::array<double, 4>;

inline Px ToPx(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }

/// A document with an image source feeding one tool of class `cls`.
struct Rig {
    OrvaneDoc doc;
    Test::ImageSourceTool *source;
    Operator *tool;
    Rig(const char *cls, Ref<Image> img)
        : source(Test::AddImageSource(doc, "Src", std::move(img))), tool(doc.AddTool(OvID(cls))) {
        EXPECT_TRUE(tool && tool->FindInput("Input")->ConnectTo(source->FindMainOutput()));
    }
};

/// Renders a tool's main output without the result cache (on `device` when given, in `task` when given).
inline Ref<Image> Render(Operator *op, const ImgRectI *roi = nullptr, uint32_t flags = 0,
                         IDeviceContext *device = nullptr, RenderTask *task = nullptr) {
    RenderTask own;
    RenderTask &t = task ? *task : own;
    t.SetDevice(device);
    EvalOptions opt;
    opt.task = &t, opt.flags = flags, opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    return Test::EvalImage(op, 0.0, opt);
}

/// Expects `a` to hold `b`'s bytes over `r`.
inline void ExpectSameBits(const Image &a, const Image &b, const ImgRectI &r) {
    for (int y = r.y0; y < r.y1; ++y)
        ASSERT_EQ(std::memcmp(a.PixelAddress(r.x0, y), b.PixelAddress(r.x0, y), size_t(r.Width()) * a.BytesPerPixel()),
                  0)
            << "row " << y;
}

using Model = std::function<Px(const Image &src, const Px &in)>;

/// Renders the tool over a pattern at every depth (`set` makes its settings) and compares each pixel with `model`
/// of the source pixel (a mask: its value in every channel): float32 within 2e-5, float16 within 1.5e-3 (relative
/// above 1), integers the nearest stored value within float rounding of the half-way points.
inline void ExpectModelOnEveryDepth(const char *cls, const std::function<void(Operator *)> &set, const Model &model) {
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32, DepthAInt16}) {
        SCOPED_TRACE("depth " + std::to_string(depth));
        Ref<Image> src = Test::PatternImage(37, 11, depth, 7);
        Rig rig(cls, src);
        set(rig.tool);
        Ref<Image> out = Render(rig.tool);
        ASSERT_TRUE(out && out.Get() != src.Get());
        const bool isFloat = src->IsFloat(), mask = src->IsMask();
        const double top = isFloat ? 1 : depth == DepthRGBAInt8 ? 255 : 65535;
        const double tol = depth == DepthRGBAFlt32 || depth == DepthAFlt32 ? 2e-5 : 1.5e-3;
        for (int y = 0; y < 11; ++y)
            for (int x = 0; x < 37; ++x) {
                Px in = ToPx(src->GetFlt(x, y));
                if (mask) in = {in[3], in[3], in[3], in[3]};
                const Px want = model(*src, in), got = ToPx(out->GetFlt(x, y));
                for (int c = mask ? 3 : 0; c < 4; ++c)
                    if (isFloat)
                        ASSERT_NEAR(got[c], want[c], tol * std::max(1.0, std::fabs(want[c]))) << x << "," << y;
                    else
                        ASSERT_NEAR(got[c] * top, std::clamp(want[c], 0.0, 1.0) * top, 0.52) << x << "," << y;
            }
    }
}

/// The rules of the frame for a tool whose settings are already made (`set` applies them to a fresh tool), with
/// `model` the expected colour of an input colour of the source image, within `tol` (relative above 1) on float32 and
/// one 16-bit step plus `tol` on 16-bit: under each clipping mode the data window, the canvas colour (processed, or
/// kept under Domain and Frame), the processed canvas beyond the input's window, pre-calculation windows without
/// pixels, regions of interest that are the same bits as the whole frame, and the same bits with one worker or many.
inline void ExpectFrameRules(const char *cls, const std::function<void(Operator *)> &set, const Model &model,
                             double tol) {
    const ImgRectI inWindow(8, 4, 40, 28);
    const FltPixel canvas{0.2f, 0.4f, 0.6f, 0.8f};
    const std::tuple<const char *, ImgRectI, bool> clips[] = {{"ClippingMode_None", inWindow, false},
                                                              {"ClippingMode_Domain", inWindow, true},
                                                              {"ClippingMode_Frame", ImgRectI(0, 0, 48, 32), true}};
    for (int depth : {DepthRGBAFlt32, DepthRGBAInt16})
        for (const auto &[mode, window, keepsCanvas] : clips) {
            SCOPED_TRACE(std::string(mode) + ", depth " + std::to_string(depth));
            const bool integer = depth == DepthRGBAInt16;
            Ref<Image> src = Test::WindowedImage(48, 32, inWindow, canvas, 3, depth);
            Rig rig(cls, src);
            set(rig.tool);
            Test::SetID(rig.tool, "ClippingMode", mode);
            auto near = [&](const Px &got, const Px &want, const char *what) {
                for (int c = 0; c < 4; ++c) {
                    const double w = integer ? std::clamp(want[c], 0.0, 1.0) : want[c];
                    ASSERT_NEAR(got[c], w, integer ? 1.0 / 65535 + tol : tol * std::max(1.0, std::fabs(w)))
                        << what << " channel " << c;
                }
            };
            Ref<Image> shape = Render(rig.tool, nullptr, ReqFlagPreCalc);
            ASSERT_TRUE(shape && shape->IsNoData() && !shape->HasScanLineData() && shape->DataWindow() == window);
            Ref<Image> out = Render(rig.tool);
            ASSERT_TRUE(out && out->DataWindow() == window);
            const Px processedCanvas = model(*src, ToPx(canvas));
            if (keepsCanvas)
                EXPECT_EQ(out->GetCanvasColor(), canvas);
            else
                for (int c = 0; c < 4; ++c) EXPECT_NEAR(ToPx(out->GetCanvasColor())[c], processedCanvas[c], tol);
            for (int y = window.y0; y < window.y1; ++y)
                for (int x = window.x0; x < window.x1; ++x) {
                    const Px want = inWindow.Contains(x, y) ? model(*src, ToPx(src->GetFlt(x, y))) : processedCanvas;
                    near(ToPx(out->GetFlt(x, y)), want, (std::to_string(x) + "," + std::to_string(y)).c_str());
                }
            for (const ImgRectI &roi : {ImgRectI(5, 7, 30, 20), ImgRectI(0, 0, 10, 5), ImgRectI(38, 25, 60, 40)}) {
                Ref<Image> part = Render(rig.tool, &roi);
                ASSERT_TRUE(part && part->DataWindow() == (window & roi) && part->ValidWindow() == (window & roi));
                EXPECT_EQ(part->GetCanvasColor(), out->GetCanvasColor());
                ExpectSameBits(*part, *out, window & roi);
            }
            const int before = WorkerCount();
            SetWorkerCount(1);
            Ref<Image> one = Render(rig.tool);
            SetWorkerCount(before);
            ASSERT_TRUE(one && one.Get() != out.Get());
            ExpectSameBits(*one, *out, window);
        }
}

} // namespace Orvane::gaintest
