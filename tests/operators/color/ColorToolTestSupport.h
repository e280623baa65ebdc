#pragma once
// What the tests of the small colour tools share: a document with an image
// source feeding the tool, values read back exactly at every depth, a model
// check of every pixel, and the frame checks every per-pixel tool must pass
// (pre-calculation windows, regions equal to the crop of the whole render, the
// canvas beyond the input's window, the worker count).
#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "host/flow/Engine.h"
#include "host/flow/Link.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::colortest {

using Px = std::array<double, 4>;
/// The tool's function of one pixel, in double, as the test writes it.
using PixelModel = std::function<Px(const Px &)>;

inline constexpr int kEveryDepth[] = {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8};

/// A document with an image source feeding the main input of a tool of class `classId`.
struct Rig {
    OrvaneDoc doc;
    Test::ImageSourceTool *source;
    Operator *tool;
    Rig(const char *classId, Ref<Image> img) : source(Test::AddImageSource(doc, "Src", std::move(img))) {
        tool = doc.AddTool(OvID(classId));
        EXPECT_TRUE(tool && tool->FindMainInput() && tool->FindMainInput()->ConnectTo(source->FindMainOutput()));
    }
};

/// Renders a tool's main output without the result cache.
inline Ref<Image> Render(Operator *op, const ImgRectI *roi = nullptr, uint32_t flags = 0) {
    RenderTask task;
    EvalOptions opt;
    opt.task = &task, opt.flags = flags, opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    return Orvane::Test::EvalImage(op, 0.0, opt);
}

/// The value of channel c at (x, y) over 0..1, read exactly from the stored
/// data (integers over 255 or 65535 in double).
inline double Unit(const Image &img, int x, int y, int c) {
    if (img.IsFloat()) {
        const FltPixel p = img.GetFlt(x, y);
        const float v[4] = {p.R, p.G, p.B, p.A};
        return v[c];
    }
    const int i = (x - img.DataWindow().x0) * (img.IsMask() ? 1 : 4) + (img.IsMask() ? 0 : c);
    if (img.Depth() == DepthRGBAInt8 || img.Depth() == DepthAInt8) return img.Row<uint8_t>(y)[i] / 255.0;
    return img.Row<uint16_t>(y)[i] / 65535.0;
}

inline Px UnitPx(const Image &img, int x, int y) {
    return {Unit(img, x, y, 0), Unit(img, x, y, 1), Unit(img, x, y, 2), Unit(img, x, y, 3)};
}

inline Px ToPx(const FltPixel &p) { return {p.R, p.G, p.B, p.A}; }

/// How far a stored value may lie from the exact result `e` at `depth`: half
/// a step for integers (clamped to 0..1), half an ulp for floats.
inline double StoredTolerance(int depth, double e) {
    switch (depth) {
    case DepthRGBAInt8:
    case DepthAInt8: return 0.5 / 255 + 1e-9;
    case DepthRGBAInt16:
    case DepthAInt16: return 0.5 / 65535 + 1e-11;
    case DepthRGBAFlt16:
    case DepthAFlt16: return std::fabs(e) / 2048 + 3e-8;
    default: return std::fabs(e) * 6e-8 + 1e-37;
    }
}

/// What integer depths make of an exact result: clamped to 0..1.
inline double Storable(int depth, double e) { return FormatOfDepth(depth).isFloat ? e : std::clamp(e, 0.0, 1.0); }

/// Expects every pixel of `out` over `window` to be `model` of `in`'s pixel
/// (beyond `in`'s data window: of its canvas colour), within the stored
/// rounding and `slack` (for tools that work in float on integer data).
inline void ExpectModel(const PixelModel &model, const Image &in, const Image &out, const std::string &what,
                        double slack = 0) {
    const ImgRectI dw = out.DataWindow();
    const int depth = out.Depth();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const Px e = model(in.DataWindow().Contains(x, y) ? UnitPx(in, x, y) : ToPx(in.GetCanvasColor()));
            for (int c = 0; c < 4; ++c) {
                const double want = Storable(depth, e[c]);
                ASSERT_NEAR(Unit(out, x, y, c), want, StoredTolerance(depth, want) + slack)
                    << what << " at " << x << "," << y << " channel " << c << " from " << Unit(in, x, y, c);
            }
        }
}

/// Expects `a` to hold `b`'s bytes over `r`.
inline void ExpectSameBits(const Image &a, const Image &b, const ImgRectI &r) {
    for (int y = r.y0; y < r.y1; ++y)
        ASSERT_EQ(std::memcmp(a.PixelAddress(r.x0, y), b.PixelAddress(r.x0, y), size_t(r.Width()) * a.BytesPerPixel()),
                  0)
            << "row " << y;
}

/// The frame every per-pixel tool keeps, over a 48 x 32 frame whose data
/// window leaves canvas on every side, at every depth: a pre-calculation
/// makes the windows without pixels; the canvas colour goes through `model`
/// (beyond the frame under a clipping mode the input's stays); pixels and
/// canvas spans follow `model`; regions are crops of the whole render; one
/// worker or many give the same bits. `setup` sets the tool's controls.
inline void ExpectFrame(const char *classId, const std::function<void(Operator *)> &setup, const PixelModel &model,
                        double slack = 0, bool canvasThroughModel = true,
                        std::vector<int> depths = {std::begin(kEveryDepth), std::end(kEveryDepth)}) {
    const ImgRectI inWindow(8, 4, 40, 28);
    const FltPixel canvas{0.2f, 0.4f, 0.6f, 0.8f};
    const std::tuple<const char *, ImgRectI, bool> clips[] = {{"ClippingMode_None", inWindow, false},
                                                              {"ClippingMode_Frame", ImgRectI(0, 0, 48, 32), true}};
    for (int depth : depths)
        for (const auto &[mode, window, keepsInputCanvas] : clips) {
            const std::string what = std::string(classId) + " " + mode + ", depth " + std::to_string(depth);
            SCOPED_TRACE(what);
            Ref<Image> src = Orvane::Test::WindowedImage(48, 32, inWindow, canvas, 3, depth);
            Rig rig(classId, src);
            setup(rig.tool);
            Orvane::Test::SetID(rig.tool, "ClippingMode", mode);
            Ref<Image> shape = Render(rig.tool, nullptr, ReqFlagPreCalc);
            ASSERT_TRUE(shape && shape->IsNoData() && !shape->HasScanLineData());
            EXPECT_EQ(shape->DataWindow(), window);
            EXPECT_EQ(rig.source->processCount, 0) << "pre-calculation asked the source for pixels";
            Ref<Image> out = Render(rig.tool);
            ASSERT_TRUE(out && out->DataWindow() == window);
            const Px outCanvas = ToPx(out->GetCanvasColor());
            const Px wantCanvas = keepsInputCanvas || !canvasThroughModel ? ToPx(canvas) : model(ToPx(canvas));
            for (int c = 0; c < 4; ++c) EXPECT_NEAR(outCanvas[c], wantCanvas[c], 1e-6 * (1 + std::fabs(wantCanvas[c])));
            ExpectModel(model, *src, *out, what, slack);
            for (const ImgRectI &roi : {ImgRectI(5, 7, 30, 20), ImgRectI(38, 25, 60, 40)}) {
                Ref<Image> part = Render(rig.tool, &roi);
                ASSERT_TRUE(part && part->DataWindow() == (window & roi) && part->ValidWindow() == (window & roi));
                EXPECT_EQ(part->GetCanvasColor(), out->GetCanvasColor());
                ExpectSameBits(*part, *out, window & roi);
            }
            const int before = WorkerCount();
            SetWorkerCount(1);
            Ref<Image> one = Render(rig.tool);
            SetWorkerCount(before);
            ASSERT_TRUE(one);
            ExpectSameBits(*one, *out, window);
        }
}

} // namespace Orvane::colortest
