// The Blur tool: controls, filter table, windows under each clipping mode, pass-through, Lock X/Y, passes and
// blend. Expected pixels come from the host blur called with the request the tool should send (BlurTest.cpp
// checks that against direct convolutions).
#include <optional>
#include <string>
#include <tuple>

#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::blurtooltest {
namespace {
namespace ts = ::Orvane::Test;

/// An RGBA float frame w x h with the test pattern over `window` and a canvas.
Ref<Image> Source(int w, int h, const ImgRectI &window) {
    return ts::WindowedImage(w, h, window, {0.1f, 0.2f, 0.3f, 0.4f}, 5, DepthRGBAFlt32);
}

/// The tool's output, with the cache off so that every call reaches the tools.
Ref<Image> Render(Operator *op, const std::optional<ImgRectI> &roi = std::nullopt, uint32_t flags = 0) {
    EvalOptions opt;
    opt.useCache = false;
    opt.flags = flags;
    if (roi) opt.roi = ImageDomain(*roi);
    return Ref<Image>(dynamic_cast<Image *>(Evaluate(op->FindMainOutput(), 0.0, opt).Get()));
}

/// A control length of `pixels` on a frame `width` wide, and the normalised
/// size the tool sends for it (control value / 720).
double Control(double pixels, int width) { return pixels * 720.0 / width; }
double Sent(double pixels, int width) { return Control(pixels, width) / 720.0; }

/// Whether `got` is what the host call gives for `src` into got's window: a blur of `type` with the sizes
/// sent (x and y), reading `source`, four passes and every channel unless `extra` says otherwise.
::testing::AssertionResult IsHostBlur(const Ref<Image> &got, Image *src, int type, double x, double y,
                                      const ImgRectI &source, const TagList &extra = {}) {
    if (!got) return ::testing::AssertionFailure() << "no image";
    TagList tags{{BlurFilterType, type}, {BlurXSize, x}, {BlurYSize, y}, {BlurPasses, 4}, {BlurSourceWindow, &source}};
    tags.Merge(extra);
    const ImgRectI w = got->DataWindow();
    Ref<Image> want = NewImageTagList({{ImgLikeImage, src}, {ImgDataWindow, &w}});
    if (!src->BlurTagList(want.Get(), tags)) return ::testing::AssertionFailure() << "the host blur failed";
    if (!(got->GetCanvasColor() == want->GetCanvasColor())) return ::testing::AssertionFailure() << "canvas";
    for (int y = w.y0; y < w.y1; ++y)
        for (int x = w.x0; x < w.x1; ++x)
            if (!(got->GetFlt(x, y) == want->GetFlt(x, y)))
                return ::testing::AssertionFailure() << "pixel " << x << "," << y;
    return ::testing::AssertionSuccess();
}

class BlurTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { ts::LoadOperators(); }

    /// A Blur in `d` fed by a source of `img` that notes what it is asked for.
    Operator *Make(Ref<Image> img, OrvaneDoc *d = nullptr, Operator *blur = nullptr) {
        probe = ts::AddImageSource(d ? *d : doc, "Src", std::move(img));
        if (!blur) blur = doc.AddTool(OvID("Blur"));
        EXPECT_TRUE(blur && probe && blur->FindInput("Input")->ConnectTo(probe->Out()));
        return blur;
    }

    OrvaneDoc doc;
    ts::ImageSourceTool *probe = nullptr;
};

TEST_F(BlurTool, FilterTableControlsAndNothingToDo) {
    // nullptr: the default, Fast Gaussian.
    const std::pair<const char *, int> table[] = {{nullptr, 5},        {"Box", 0},          {"Bartlett", 2},
                                                  {"Multi-box", 9},    {"Gaussian", 4},     {"Fast Gaussian", 5},
                                                  {"YV Gaussian", 10}, {"VYV N=3 Gau", 11}, {"VYV N=5 Gau", 12},
                                                  {"VYV N=6 Gau", 13}, {"Soften", 1},       {"Anything", 1}};
    // Through the tool: each ID's output is the host blur of that kind over the frame.
    const ImgRectI frame(0, 0, 48, 32);
    Ref<Image> img = Source(48, 32, frame);
    Operator *blur = Make(img);
    ts::SetNumber(blur, "XBlurSize", Control(20, 48)); // wide enough that the fast Gaussian is not the exact one
    for (const auto &[id, type] : table) {
        if (id) ts::SetID(blur, "Filter", id);
        EXPECT_TRUE(IsHostBlur(Render(blur), img.Get(), type, Sent(20, 48), Sent(20, 48), frame))
            << (id ? id : "default");
    }
    Input *x = blur->FindInput("XBlurSize"), *y = blur->FindInput("YBlurSize"), *passes = blur->FindInput("Passes");
    // Still locked, and not Multi-box.
    EXPECT_STREQ(x->Label(), "Blur Size");
    EXPECT_FALSE(y->IsVisible() || passes->IsVisible());
    ts::SetNumber(blur, "LockXY", 0);
    EXPECT_STREQ(x->Label(), "X Blur Size");
    EXPECT_TRUE(y->IsVisible());
    ts::SetID(blur, "Filter", "Multi-box");
    EXPECT_TRUE(passes->IsVisible());
    EXPECT_STREQ(x->Label(), "X Blur Size") << "the filter leaves the sizes alone";
    ts::SetID(blur, "Filter", "Gaussian");
    EXPECT_FALSE(passes->IsVisible());
    ts::SetNumber(blur, "LockXY", 1);
    EXPECT_FALSE(y->IsVisible());
    // Passes stay within 1..64.
    ts::SetNumber(blur, "Passes", 100);
    EXPECT_EQ(dynamic_cast<const Number &>(*passes->Constant()).value, 64.0);
    // Nothing to do hands the input on.
    ts::SetID(blur, "Filter", "Fast Gaussian");
    ts::SetNumbers(blur, {{"XBlurSize", 0}, {"YBlurSize", 5}}); // Y ignored while locked
    EXPECT_EQ(Render(blur).Get(), img.Get());
    // Unlocked, a size on either axis blurs, however small.
    ts::SetNumber(blur, "LockXY", 0);
    EXPECT_NE(Render(blur).Get(), img.Get());
    ts::SetNumbers(blur, {{"YBlurSize", 0}, {"XBlurSize", 1e-4}}); // 1.4e-7 of the frame: above 2^-23
    EXPECT_NE(Render(blur).Get(), img.Get());
    ts::SetNumber(blur, "XBlurSize", 5e-5); // 6.9e-8: below
    EXPECT_EQ(Render(blur).Get(), img.Get());
    // An input without pixels is handed on as it is.
    const ImgRectI none(5, 5, 5, 9);
    Ref<Image> empty = NewImageTagList({{ImgLikeImage, img.Get()}, {ImgDataWindow, &none}});
    probe->SetImage(empty);
    ts::SetNumber(blur, "XBlurSize", 10);
    EXPECT_EQ(Render(blur).Get(), empty.Get());
}

TEST_F(BlurTool, WindowsUnderEachClippingModeAndForUnboundedKinds) {
    // A data window reaching past the frame on the left and bottom, inside it
    // elsewhere: frame 64 x 32, Box of 5 pixels across and 3 down (unlocked).
    const ImgRectI frame(0, 0, 64, 32), dw(-8, -4, 50, 26), roi(30, 10, 70, 20);
    Ref<Image> img = Source(64, 32, dw);
    Operator *blur = Make(img);
    ts::SetID(blur, "Filter", "Box");
    ts::SetNumbers(blur, {{"LockXY", 0}, {"XBlurSize", Control(5, 64)}, {"YBlurSize", Control(3, 64)}});
    const ImgRectI grown = dw.Grown(5, 3);
    struct Case {
        const char *mode;
        ImgRectI out, source, asked;
    };
    // Frame clipping is the default.
    const Case cases[] = {{nullptr, grown & frame, frame, roi.Grown(5, 3) & frame},
                          {"ClippingMode_Domain", grown & dw, dw, roi.Grown(5, 3) & dw},
                          {"ClippingMode_None", grown, grown, roi.Grown(5, 3)}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.mode ? c.mode : "default");
        if (c.mode) ts::SetID(blur, "ClippingMode", c.mode);
        Ref<Image> got = Render(blur);
        ASSERT_TRUE(got);
        EXPECT_EQ(got->DataWindow(), c.out);
        EXPECT_TRUE(IsHostBlur(got, img.Get(), BlurBox, Sent(5, 64), Sent(3, 64), c.source));
        // Pre-calculation: the same windows from the domain, without pixels.
        Ref<Image> shape = Render(blur, std::nullopt, ReqFlagPreCalc);
        ASSERT_TRUE(shape && shape->IsNoData());
        EXPECT_EQ(shape->DataWindow(), c.out);
        // A region of interest narrows the output; the input is asked for that region grown by the reach, clipped as
        // the mode says. The source window is never narrowed by the region.
        probe->asked.clear();
        Ref<Image> part = Render(blur, roi);
        ASSERT_TRUE(part && probe->asked.size() == 1 && probe->asked[0].has_value());
        EXPECT_EQ(part->DataWindow(), c.out & roi);
        EXPECT_EQ(probe->asked[0]->rect, c.asked);
        EXPECT_TRUE(IsHostBlur(part, img.Get(), BlurBox, Sent(5, 64), Sent(3, 64), c.source));
    }
    // Unbounded kinds keep the frame and ask for the whole input.
    ts::SetID(blur, "Filter", "VYV N=5 Gau");
    ts::SetNumbers(blur, {{"LockXY", 1}, {"XBlurSize", Control(4, 64)}});
    for (const char *mode : {"ClippingMode_Frame", "ClippingMode_Domain", "ClippingMode_None"}) {
        SCOPED_TRACE(mode);
        ts::SetID(blur, "ClippingMode", mode);
        probe->asked.clear();
        Ref<Image> got = Render(blur, ImgRectI(10, 10, 20, 20));
        ASSERT_TRUE(got && probe->asked.size() == 1);
        EXPECT_EQ(got->DataWindow(), frame) << "the region does not narrow it either";
        EXPECT_FALSE(probe->asked[0].has_value()) << "the whole input";
        EXPECT_EQ(Render(blur, std::nullopt, ReqFlagPreCalc)->DataWindow(), dw) << "the domain in pre-calculation";
        // The source window is still sent: the frame, or the domain.
        const ImgRectI source = std::string(mode) == "ClippingMode_Frame" ? frame : dw;
        EXPECT_TRUE(IsHostBlur(got, img.Get(), BlurVYV5Gaussian, Sent(4, 64), Sent(4, 64), source));
    }
}

TEST_F(BlurTool, PassesLockChannelsAndBlendReachThePixels) {
    const ImgRectI frame(0, 0, 50, 40);
    Ref<Image> img = Source(50, 40, frame);
    Operator *blur = Make(img);
    ts::SetID(blur, "Filter", "Multi-box");
    // Y is ignored while locked.
    ts::SetNumbers(blur, {{"XBlurSize", Control(6, 50)}, {"YBlurSize", Control(2, 50)}, {"Passes", 2}, {"Green", 0}});
    Ref<Image> got = Render(blur);
    ASSERT_TRUE(got);
    const TagList two{{BlurDoGreen, 0}, {BlurPasses, 2}}, four{{BlurDoGreen, 0}};
    EXPECT_TRUE(IsHostBlur(got, img.Get(), BlurMultiBox, Sent(6, 50), Sent(6, 50), frame, two));
    EXPECT_FALSE(IsHostBlur(got, img.Get(), BlurMultiBox, Sent(6, 50), Sent(6, 50), frame, four));
    EXPECT_EQ(got->GetFlt(20, 20).G, img->GetFlt(20, 20).G) << "green is off";
    ts::SetNumber(blur, "LockXY", 0);
    // Blend b gives source + (blur - source) b, whether it is set on the common page or on the tool's own; both
    // together multiply.
    Ref<Image> full = Render(blur);
    for (auto [blend, clone, b] : {std::tuple{0.5, 1.0, 0.5}, {1.0, 0.25, 0.25}, {0.5, 0.25, 0.125}}) {
        ts::SetNumbers(blur, {{"Blend", blend}, {"BlendClone", clone}});
        Ref<Image> got = Render(blur);
        ASSERT_TRUE(got);
        for (int y = 0; y < 30; y += 7)
            for (int x = 0; x < 40; x += 7) {
                const FltPixel s = img->GetFlt(x, y), f = full->GetFlt(x, y), g = got->GetFlt(x, y);
                EXPECT_NEAR(g.R, s.R + (f.R - s.R) * b, 2e-6) << x << "," << y;
                EXPECT_NEAR(g.A, s.A + (f.A - s.A) * b, 2e-6) << x << "," << y;
            }
    }
    // The common channel switches still apply after the blur.
    ts::SetNumbers(blur, {{"Blend", 1.0}, {"BlendClone", 1.0}, {"ProcessRed", 0}});
    Ref<Image> noRed = Render(blur);
    EXPECT_EQ(noRed->GetFlt(10, 10).R, img->GetFlt(10, 10).R);
    EXPECT_EQ(noRed->GetFlt(10, 10).B, full->GetFlt(10, 10).B);
}

TEST_F(BlurTool, SoftenLoadedFromADocumentIsTheFallbackKernel) {
    // A document read after construction keeps "Soften" as it stands (no
    // button shows it) and the tool blurs with the fallback kernel.
    OrvaneDoc loaded;
    const DocumentLoadResult result = LoadDocument("Orvane.Document { Version = 1, Tools = { Blur1 = Blur { Inputs = { "
                                                   "Filter = \"Soften\", XBlurSize = 36 } } } }",
                                                   loaded);
    ASSERT_TRUE(result.error.empty()) << result.error;
    Operator *blur = loaded.FindTool("Blur1");
    ASSERT_NE(blur, nullptr);
    const auto *id = dynamic_cast<const IDValue *>(blur->FindInput("Filter")->Constant().Get());
    ASSERT_TRUE(id && id->value == OvID("Soften"));
    const ImgRectI frame(0, 0, 64, 32);
    Ref<Image> img = Source(64, 32, frame);
    EXPECT_TRUE(IsHostBlur(Render(Make(img, &loaded, blur)), img.Get(), BlurSoften, 0.05, 0.05, frame));
}

} // namespace
} // namespace Orvane::blurtooltest
