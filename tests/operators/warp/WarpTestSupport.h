#pragma once
// Helpers shared by the sizing tool tests: a source noting the regions asked of it, rendering with request
// options, the host's resizer called directly (the reference the tools must match), and pixel comparisons.
#include <gtest/gtest.h>

#include <initializer_list>
#include <optional>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/ResizeFilters.h"
#include "tests/support/TestSupport.h"

namespace Orvane::WarpTest {

using namespace Orvane::Test;
using ProbeSource = ImageSourceTool;
constexpr int E = DomainEndless;

/// A source of `img` that cuts it to each pixel request's region and notes the region.
inline ProbeSource *AddProbe(OrvaneDoc &doc, Ref<Image> img, const std::string &name = "Src") {
    ProbeSource *probe = AddImageSource(doc, name, std::move(img));
    if (probe) probe->cutToRegion = true;
    return probe;
}

/// A tool of `cls` in `doc` reading `src` (with these number controls).
inline Operator *AddTool(OrvaneDoc &doc, const char *cls, Operator *src,
                         const std::vector<std::pair<const char *, double>> &controls = {}) {
    Operator *op = doc.AddTool(OvID(cls));
    EXPECT_TRUE(op && (!src || op->FindInput("Input")->ConnectTo(src->FindMainOutput()))) << cls;
    if (op) SetNumbers(op, controls);
    return op;
}

/// The constant value of a number input (-1 when it has none).
inline double Control(Operator *op, const char *id) {
    const auto *n = dynamic_cast<const Number *>(op->FindInput(id)->Constant().Get());
    return n ? n->value : -1.0;
}

struct RenderOptions {
    uint32_t flags = 0;
    int proxy = 1;
    bool passThrough = false;
    std::optional<ImgRectI> roi = std::nullopt;
    bool useCache = false;
};

/// The tool's main output, or null.
inline Ref<Image> Render(Operator *op, const RenderOptions &o = {}) {
    RenderTask task;
    task.proxyScale = o.proxy;
    task.passThrough = o.passThrough;
    EvalOptions opt;
    opt.flags = o.flags | (o.proxy > 1 ? ReqFlagProxy : 0u);
    opt.task = &task;
    opt.useCache = o.useCache;
    if (o.roi) opt.roi = ImageDomain(*o.roi);
    return Ref<Image>(dynamic_cast<Image *>(Evaluate(op->FindMainOutput(), 0.0, opt).Get()));
}

/// The image exists and has a frame of w x h.
inline ::testing::AssertionResult Sized(const Ref<Image> &img, int w, int h) {
    if (img && img->Width() == w && img->Height() == h) return ::testing::AssertionSuccess();
    if (!img) return ::testing::AssertionFailure() << "no image";
    return ::testing::AssertionFailure() << "frame " << img->Width() << " x " << img->Height();
}

/// The pre-calculation of the tool's main output (windows, no pixels).
inline Ref<Image> Shape(Operator *op, RenderOptions o = {}) {
    o.flags |= ReqFlagPreCalc;
    return Render(op, o);
}

/// The host's resizer called directly: `src` into a new w x h image over `window` with the resize request `tags`.
inline Ref<Image> DirectResize(const Image &src, int w, int h, const ImgRectI &window, const TagList &tags) {
    Ref<Image> out = NewImageTagList(
        {{ImgLikeImage, &src}, {ImgWidth, w}, {ImgHeight, h}, {ImgDataWindow, &window}, {ImgValidWindow, &window}});
    EXPECT_TRUE(out && out->AllocScanLineData() && src.ResizeTagList(out.Get(), tags));
    return out;
}

/// Where the host's resizer lays the source: scales, offsets and edge modes.
struct Placement {
    double xs, ys, ox, oy;
    int xEdges, yEdges;
};

/// DirectResize with `filter` (Hanning window) and a placement, reading `read` when given.
inline Ref<Image> PlacedResize(const Image &src, int w, int h, const ImgRectI &window, int filter, const Placement &p,
                               const ImgRectI *read = nullptr) {
    TagList tags{{ResizeFilter, filter},   {ResizeWindow, RszWindowHanning},
                 {ResizeXScale, p.xs},     {ResizeYScale, p.ys},
                 {ResizeXOffset, p.ox},    {ResizeYOffset, p.oy},
                 {ResizeXEdges, p.xEdges}, {ResizeYEdges, p.yEdges}};
    if (read) tags.Set({ResizeSourceWindow, read});
    return DirectResize(src, w, h, window, tags);
}

/// Every pixel of `r` equal in both images (canvas colours outside their windows).
inline void ExpectSamePixels(const Image &a, const Image &b, const ImgRectI &r, const std::string &what = "") {
    int bad = 0;
    for (int y = r.y0; y < r.y1 && bad < 5; ++y)
        for (int x = r.x0; x < r.x1 && bad < 5; ++x) {
            const FltPixel p = a.GetFlt(x, y), q = b.GetFlt(x, y);
            if (!(p == q) && ++bad)
                ADD_FAILURE() << what << " pixel (" << x << ", " << y << "): " << p.R << " " << p.G << " " << p.B << " "
                              << p.A << " against " << q.R << " " << q.G << " " << q.B << " " << q.A;
        }
}

/// Each region rendered alone holds the whole frame's pixels there.
inline void ExpectRegionsMatchWhole(Operator *op, std::initializer_list<ImgRectI> regions) {
    Ref<Image> whole = Render(op);
    ASSERT_NE(whole, nullptr);
    for (const ImgRectI &roi : regions) {
        Ref<Image> part = Render(op, {.roi = roi});
        ASSERT_NE(part, nullptr);
        ExpectSamePixels(*part, *whole, roi);
    }
}

/// An image of w x h whose every pixel is `c`.
inline Ref<Image> FlatImage(int w, int h, int depth, const FltPixel &c) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    img->Fill(c);
    return img;
}

} // namespace Orvane::WarpTest
