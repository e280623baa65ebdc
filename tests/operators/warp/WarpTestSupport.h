#pragma once
// Helpers shared by the sizing tool tests: a source tool that records the
// regions it is asked for, rendering with request options, the host's
// resizer called directly (the reference the tools must match), and pixel
// comparisons.
#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/ResizeFilters.h"
#include "tests/support/TestSupport.h"

namespace Orvane::WarpTest {

using Orvane::Test::LoadOperators;
using Orvane::Test::PatternImage;
using Orvane::Test::SetID;
using Orvane::Test::SetNumber;
using Orvane::Test::SetPoint;

/// Outputs a fixed image (windows only in a pre-calculation), cut to the
/// region each pixel request asks for, and notes that region.
class ProbeSource : public ThreadedOperator {
public:
    ProbeSource(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void SetImage(Ref<Image> img) { image_ = std::move(img); }
    void Process(Request *req) override {
        if (!image_) return req->SetOutputData(output_, nullptr);
        if (req->IsPreCalc()) {
            const ImgRectI dw = image_->DataWindow();
            const FltPixel canvas = image_->GetCanvasColor();
            Ref<Image> shape = NewImageTagList(
                {{ImgLikeImage, image_.Get()}, {ImgDataWindow, &dw}, {ImgNoData, 1}, {ImgCanvasColor, &canvas}});
            return req->SetOutputData(output_, shape.Get());
        }
        asked.push_back(req->RoI());
        if (!req->RoI() || req->RoI()->rect.Contains(image_->DataWindow()))
            return req->SetOutputData(output_, image_.Get());
        // Only what was asked for: the rest is canvas, as from any tool.
        const ImgRectI cut = image_->DataWindow() & req->RoI()->rect;
        req->SetOutputData(output_, image_->CopyOfImageTagList({{ImgDataWindow, &cut}}).Get());
    }
    /// The regions of interest of the pixel requests so far (absent: the whole frame).
    std::vector<std::optional<ImageDomain>> asked;

private:
    Ref<Image> image_;
    Output *output_;
};

inline ProbeSource *AddProbe(OrvaneDoc &doc, Ref<Image> img, const std::string &name = "Src") {
    static const OvID probeClass("TestWarpProbe");
    static const Registry *row = [] {
        TagList tags{{RegConstructor,
                      +[](const Registry *reg, const ScriptVal &args, const TagList &t) -> Object * {
                          return new ProbeSource(reg, args, t);
                      }},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)},
                     {RegName, "Test Probe"},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1},
                     {RegSupportsRoI, 1},
                     {RegSupportsDoD, 1}};
        return Registry::_Init(&ClassRegistry, probeClass, tags);
    }();
    (void)row;
    auto *probe = dynamic_cast<ProbeSource *>(doc.AddTool(probeClass, name));
    EXPECT_NE(probe, nullptr);
    if (probe) probe->SetImage(std::move(img));
    return probe;
}

/// A tool of `cls` in `doc` reading `src`.
inline Operator *AddTool(OrvaneDoc &doc, const char *cls, Operator *src) {
    Operator *op = doc.AddTool(OvID(cls));
    EXPECT_NE(op, nullptr) << cls;
    if (op && src) {
        EXPECT_TRUE(op->FindInput("Input")->ConnectTo(src->FindMainOutput()));
    }
    return op;
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
    Ref<Parameter> p = Evaluate(op->FindMainOutput(), 0.0, opt);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

/// The pre-calculation of the tool's main output (windows, no pixels).
inline Ref<Image> Shape(Operator *op, const RenderOptions &o = {}) {
    RenderOptions pre = o;
    pre.flags |= ReqFlagPreCalc;
    return Render(op, pre);
}

/// The host's resizer called directly: `src` into a new w x h image over
/// `window` with the resize request `tags`.
inline Ref<Image> DirectResize(const Image &src, int w, int h, const ImgRectI &window, const TagList &tags) {
    Ref<Image> out = NewImageTagList(
        {{ImgLikeImage, &src}, {ImgWidth, w}, {ImgHeight, h}, {ImgDataWindow, &window}, {ImgValidWindow, &window}});
    EXPECT_NE(out, nullptr);
    if (!out) return out;
    EXPECT_TRUE(out->AllocScanLineData());
    EXPECT_TRUE(src.ResizeTagList(out.Get(), tags));
    return out;
}

/// Every pixel of `r` equal in both images (canvas colours outside their windows).
inline void ExpectSamePixels(const Image &a, const Image &b, const ImgRectI &r, const std::string &what = "") {
    int bad = 0;
    for (int y = r.y0; y < r.y1 && bad < 5; ++y)
        for (int x = r.x0; x < r.x1 && bad < 5; ++x) {
            const FltPixel p = a.GetFlt(x, y), q = b.GetFlt(x, y);
            if (!(p == q)) {
                ++bad;
                ADD_FAILURE() << what << " pixel (" << x << ", " << y << "): " << p.R << " " << p.G << " " << p.B << " "
                              << p.A << " against " << q.R << " " << q.G << " " << q.B << " " << q.A;
            }
        }
}

/// An image of w x h whose every pixel is `c`.
inline Ref<Image> FlatImage(int w, int h, int depth, const FltPixel &c) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    img->Fill(c);
    return img;
}

} // namespace Orvane::WarpTest
