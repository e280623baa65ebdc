// The Blur tool in the processing frame: its identity and panel, the filter
// table, the windows it makes and asks for under each clipping mode, the
// pass-through, Lock X/Y, passes and blend. Expected pixels come from the
// host call made here with the request the tool is meant to send (the host
// blur itself is tested against direct convolutions in BlurTest.cpp).
#include <cmath>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Registry.h"
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

/// A source that records the region each pixel request asked of it.
class ProbeSource : public ThreadedOperator {
public:
    ProbeSource(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        if (req->IsPreCalc()) {
            const ImgRectI dw = image->DataWindow();
            req->SetOutputData(output_,
                               NewImageTagList({{ImgLikeImage, image.Get()}, {ImgDataWindow, &dw}, {ImgNoData, 1}}));
            return;
        }
        asked.push_back(req->RoI());
        req->SetOutputData(output_, image.Get());
    }
    Ref<Image> image;
    std::vector<std::optional<ImageDomain>> asked;

private:
    Output *output_;
};

const OvID ProbeClass("BlurTestProbeSource");

ProbeSource *AddProbe(OrvaneDoc &doc, Ref<Image> img) {
    static const Registry *row = [] {
        TagList tags{{RegConstructor,
                      +[](const Registry *reg, const ScriptVal &args, const TagList &t) -> Object * {
                          return new ProbeSource(reg, args, t);
                      }},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)},
                     {RegName, "Blur Test Probe"},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1},
                     {RegSupportsRoI, 1},
                     {RegSupportsDoD, 1}};
        return Registry::_Init(&ClassRegistry, ProbeClass, tags);
    }();
    (void)row;
    auto *probe = dynamic_cast<ProbeSource *>(doc.AddTool(ProbeClass));
    EXPECT_NE(probe, nullptr);
    if (probe) probe->image = std::move(img);
    return probe;
}

/// An RGBA float frame w x h with the test pattern over `window` and a canvas.
Ref<Image> Source(int w, int h, const ImgRectI &window) {
    Ref<Image> pat = ts::PatternImage(window.Width(), window.Height(), DepthRGBAFlt32, 5);
    const FltPixel canvas{0.1f, 0.2f, 0.3f, 0.4f};
    Ref<Image> img = NewImageTagList({{ImgWidth, w},
                                      {ImgHeight, h},
                                      {ImgDepth, DepthRGBAFlt32},
                                      {ImgDataWindow, &window},
                                      {ImgCanvasColor, &canvas}});
    EXPECT_TRUE(img->AllocScanLineData());
    for (int y = window.y0; y < window.y1; ++y)
        for (int x = window.x0; x < window.x1; ++x) img->PutFlt(x, y, pat->GetFlt(x - window.x0, y - window.y0));
    return img;
}

/// The tool's output, with the cache off so that every call reaches the tools.
Ref<Image> Render(Operator *op, const std::optional<ImgRectI> &roi = std::nullopt, uint32_t flags = 0) {
    EvalOptions opt;
    opt.useCache = false;
    opt.flags = flags;
    if (roi) opt.roi = ImageDomain(*roi);
    Ref<Parameter> p = Evaluate(op->FindMainOutput(), 0.0, opt);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

/// A control length of `pixels` on a frame `width` wide, and the normalised
/// size the tool sends for it (control value / 720).
double Control(double pixels, int width) { return pixels * 720.0 / width; }
double Sent(double pixels, int width) { return Control(pixels, width) / 720.0; }

/// What the host call gives for `src` into `window` with these tags.
Ref<Image> HostBlur(Image *src, const ImgRectI &window, const TagList &tags) {
    Ref<Image> out = NewImageTagList({{ImgLikeImage, src}, {ImgDataWindow, &window}});
    EXPECT_TRUE(src->BlurTagList(out.Get(), tags));
    return out;
}

bool SamePixels(const Image &a, const Image &b) {
    if (!(a.DataWindow() == b.DataWindow()) || !(a.GetCanvasColor() == b.GetCanvasColor())) return false;
    const ImgRectI w = a.DataWindow();
    for (int y = w.y0; y < w.y1; ++y)
        for (int x = w.x0; x < w.x1; ++x)
            if (!(a.GetFlt(x, y) == b.GetFlt(x, y))) return false;
    return true;
}

class BlurTool : public ::testing::Test {
protected:
    void SetUp() override { ts::LoadOperators(); }

    /// A Blur fed by a probe of `img`.
    Operator *Make(Ref<Image> img) {
        probe = AddProbe(doc, std::move(img));
        Operator *blur = doc.AddTool(OvID("Blur"));
        EXPECT_NE(blur, nullptr);
        if (blur && probe) {
            EXPECT_TRUE(blur->FindInput("Input")->ConnectTo(probe->FindMainOutput()));
        }
        return blur;
    }

    OrvaneDoc doc;
    ProbeSource *probe = nullptr;
};

TEST_F(BlurTool, RegisteredIdentity) {
    const Registry *row = ClassRegistry->Find(OvID("Blur"));
    ASSERT_NE(row, nullptr);
    EXPECT_EQ(row->TypeFlags(), RegKindOperator | RegKindTool);
    EXPECT_EQ(row->BaseID(), CLSID_ThreadedOperator);
    EXPECT_STREQ(row->ClassName(), "Blur");
    for (auto [tag, text] : {std::pair{RegPath, "Tools/Blur/Blur"},
                             {RegName, "Blur"},
                             {RegCategory, "Blur"},
                             {RegAbbreviation, "Blur"},
                             {RegHelp, "Blurs images"},
                             {RegIcon, "Icons.Tools.Icons.Blur"}})
        EXPECT_STREQ(row->Tags().GetText(tag, ""), text) << std::hex << tag;
    for (Tag on : {RegNoMotionBlurControls, RegSupportsRoI, RegSupportsDoD, RegSupportsGPUImages})
        EXPECT_TRUE(row->Tags().GetBool(on)) << std::hex << on;
    EXPECT_FALSE(row->Tags().Has(RegAlias));
}

TEST_F(BlurTool, InputsInOrderWithTheirControls) {
    Operator *blur = doc.AddTool(OvID("Blur"));
    ASSERT_NE(blur, nullptr);
    const char *const order[] = {"Filter",    "Red",       "Green",  "Blue",         "Alpha",      "LockXY",
                                 "XBlurSize", "YBlurSize", "Passes", "ClippingMode", "BlendClone", "Input"};
    for (size_t i = 0; i < std::size(order); ++i) EXPECT_EQ(blur->Inputs()[i]->ID(), OvID(order[i])) << i;
    ASSERT_EQ(blur->Pages().front().name, "Controls");

    const Input *filter = blur->FindInput("Filter");
    EXPECT_EQ(filter->Tags().GetID(InputControl), CLSID_InputControl_MultiButtonID);
    EXPECT_EQ(filter->Tags().GetID(InputDefaultId), OvID("Fast Gaussian"));
    EXPECT_TRUE(filter->Tags().GetBool(LinkForceSave));
    std::vector<std::string> buttons;
    for (const TagItem *item : filter->Tags().FindAll(ListItemId)) buttons.push_back(item->AsID().Text());
    EXPECT_EQ(buttons, (std::vector<std::string>{"Box", "Bartlett", "Multi-box", "Gaussian", "Fast Gaussian"}));

    for (int c = 0; c < 4; ++c) {
        const Input *in = blur->Inputs()[1 + c].get();
        EXPECT_EQ(in->Tags().GetLong(ControlGroup), 12);
        EXPECT_EQ(in->Tags().GetLong(ControlMember), c);
        EXPECT_EQ(dynamic_cast<const Number *>(in->Default().Get())->value, 1.0);
    }
    EXPECT_STREQ(blur->FindInput("Red")->Label(), "");
    EXPECT_FALSE(blur->FindInput("LockXY")->IsExternal()) << "neither animated nor connected";
    for (const char *id : {"XBlurSize", "YBlurSize"}) {
        const Input *in = blur->FindInput(id);
        EXPECT_FALSE(in->SendsRequest()) << id;
        EXPECT_EQ(in->Tags().GetDouble(InputMinAllowed, -1), 0.0);
        EXPECT_EQ(in->Tags().GetDouble(InputSliderHigh), 100.0);
        EXPECT_EQ(in->Tags().GetLong(SliderSteps), 101);
    }
    const Input *passes = blur->FindInput("Passes");
    EXPECT_TRUE(passes->IsInteger());
    EXPECT_EQ(passes->Tags().GetDouble(InputMinAllowed), 1.0);
    EXPECT_EQ(passes->Tags().GetDouble(InputMaxAllowed), 64.0);
    EXPECT_EQ(passes->Tags().GetDouble(InputSliderHigh), 16.0);
    EXPECT_EQ(blur->FindInput("ClippingMode")->Tags().GetID(InputDefaultId), ClippingMode_Frame);
    EXPECT_EQ(blur->Common().clippingMode, nullptr) << "the tool's own clipping mode replaces the common one";
    EXPECT_NE(blur->Common().blend, nullptr);
    EXPECT_EQ(blur->FindMainInput(), blur->FindInput("Input"));
}

TEST_F(BlurTool, LockXYAndFilterShowAndNameTheirControls) {
    Operator *blur = doc.AddTool(OvID("Blur"));
    Input *x = blur->FindInput("XBlurSize"), *y = blur->FindInput("YBlurSize"), *passes = blur->FindInput("Passes");
    // As constructed: locked, Fast Gaussian.
    EXPECT_STREQ(x->Label(), "Blur Size");
    EXPECT_FALSE(y->IsVisible());
    EXPECT_FALSE(passes->IsVisible());
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
}

TEST_F(BlurTool, FilterTableWithItsFallback) {
    const std::pair<const char *, int> table[] = {{"Box", 0},          {"Bartlett", 2},      {"Multi-box", 9},
                                                  {"Gaussian", 4},     {"Fast Gaussian", 5}, {"YV Gaussian", 10},
                                                  {"VYV N=3 Gau", 11}, {"VYV N=5 Gau", 12},  {"VYV N=6 Gau", 13},
                                                  {"Soften", 1},       {"Anything", 1}};
    const Registry *row = ClassRegistry->Find(OvID("Blur"));
    ASSERT_NE(row, nullptr);
    // Through the tool: each ID's output is the host blur of that kind.
    Ref<Image> img = Source(48, 32, ImgRectI(0, 0, 48, 32));
    Operator *blur = Make(img);
    ts::SetNumber(blur, "XBlurSize", Control(3, 48));
    for (const auto &[id, type] : table) {
        SCOPED_TRACE(id);
        ts::SetID(blur, "Filter", id);
        Ref<Image> got = Render(blur);
        ASSERT_TRUE(got);
        const ImgRectI frame(0, 0, 48, 32);
        Ref<Image> want = HostBlur(img.Get(), got->DataWindow(),
                                   {{BlurFilterType, type},
                                    {BlurXSize, Sent(3, 48)},
                                    {BlurYSize, Sent(3, 48)},
                                    {BlurPasses, 4},
                                    {BlurSourceWindow, &frame}});
        EXPECT_TRUE(SamePixels(*got, *want));
    }
}

TEST_F(BlurTool, NothingToDoHandsTheInputOn) {
    Ref<Image> img = Source(40, 30, ImgRectI(0, 0, 40, 30));
    Operator *blur = Make(img);
    ts::SetNumber(blur, "XBlurSize", 0);
    ts::SetNumber(blur, "YBlurSize", 5); // ignored while locked
    EXPECT_EQ(Render(blur).Get(), img.Get());
    // Unlocked, a size on either axis blurs, however small.
    ts::SetNumber(blur, "LockXY", 0);
    EXPECT_NE(Render(blur).Get(), img.Get());
    ts::SetNumber(blur, "YBlurSize", 0);
    ts::SetNumber(blur, "XBlurSize", 1e-4); // 1.4e-7 of the frame: above 2^-23
    EXPECT_NE(Render(blur).Get(), img.Get());
    ts::SetNumber(blur, "XBlurSize", 5e-5); // 6.9e-8: below
    EXPECT_EQ(Render(blur).Get(), img.Get());
    // An input without pixels is handed on as it is.
    const ImgRectI none(5, 5, 5, 9);
    probe->image = NewImageTagList({{ImgLikeImage, img.Get()}, {ImgDataWindow, &none}});
    ts::SetNumber(blur, "XBlurSize", 10);
    EXPECT_EQ(Render(blur).Get(), probe->image.Get());
}

TEST_F(BlurTool, WindowsUnderEachClippingMode) {
    // A data window reaching past the frame on the left and bottom, inside it
    // elsewhere: frame 64 x 32, Box of 5 pixels across and 3 down (unlocked).
    const ImgRectI frame(0, 0, 64, 32), dw(-8, -4, 50, 26);
    Ref<Image> img = Source(64, 32, dw);
    Operator *blur = Make(img);
    ts::SetID(blur, "Filter", "Box");
    ts::SetNumber(blur, "LockXY", 0);
    ts::SetNumber(blur, "XBlurSize", Control(5, 64));
    ts::SetNumber(blur, "YBlurSize", Control(3, 64));
    const ImgRectI grown = dw.Grown(5, 3);
    struct Case {
        const char *mode;
        ImgRectI out, source;
    };
    const Case cases[] = {{"ClippingMode_Frame", grown & frame, frame},
                          {"ClippingMode_Domain", grown & dw, dw},
                          {"ClippingMode_None", grown, grown}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.mode);
        ts::SetID(blur, "ClippingMode", c.mode);
        Ref<Image> got = Render(blur);
        ASSERT_TRUE(got);
        EXPECT_EQ(got->DataWindow(), c.out);
        Ref<Image> want = HostBlur(img.Get(), c.out,
                                   {{BlurFilterType, BlurBox},
                                    {BlurXSize, Sent(5, 64)},
                                    {BlurYSize, Sent(3, 64)},
                                    {BlurPasses, 4},
                                    {BlurSourceWindow, &c.source}});
        EXPECT_TRUE(SamePixels(*got, *want));
        // Pre-calculation: the same windows from the domain, without pixels.
        Ref<Image> shape = Render(blur, std::nullopt, ReqFlagPreCalc);
        ASSERT_TRUE(shape);
        EXPECT_TRUE(shape->IsNoData());
        EXPECT_EQ(shape->DataWindow(), c.out);

        // A region of interest narrows the output; the input is asked for
        // that region grown by the reach, clipped as the mode says.
        const ImgRectI roi(30, 10, 70, 20);
        probe->asked.clear();
        Ref<Image> part = Render(blur, roi);
        ASSERT_TRUE(part);
        EXPECT_EQ(part->DataWindow(), c.out & roi);
        ASSERT_EQ(probe->asked.size(), 1u);
        ASSERT_TRUE(probe->asked[0].has_value());
        const ImgRectI asked = std::string(c.mode) == "ClippingMode_Frame"    ? roi.Grown(5, 3) & frame
                               : std::string(c.mode) == "ClippingMode_Domain" ? roi.Grown(5, 3) & dw
                                                                              : roi.Grown(5, 3);
        EXPECT_EQ(probe->asked[0]->rect, asked);
        // The source window is never narrowed by the region.
        Ref<Image> wantPart = HostBlur(img.Get(), c.out & roi,
                                       {{BlurFilterType, BlurBox},
                                        {BlurXSize, Sent(5, 64)},
                                        {BlurYSize, Sent(3, 64)},
                                        {BlurPasses, 4},
                                        {BlurSourceWindow, &c.source}});
        EXPECT_TRUE(SamePixels(*part, *wantPart));
    }
}

TEST_F(BlurTool, UnboundedKindsKeepTheFrameAndAskForTheWholeInput) {
    const ImgRectI frame(0, 0, 64, 32), dw(-8, -4, 50, 26);
    Ref<Image> img = Source(64, 32, dw);
    Operator *blur = Make(img);
    ts::SetID(blur, "Filter", "VYV N=5 Gau");
    ts::SetNumber(blur, "XBlurSize", Control(4, 64));
    for (const char *mode : {"ClippingMode_Frame", "ClippingMode_Domain", "ClippingMode_None"}) {
        SCOPED_TRACE(mode);
        ts::SetID(blur, "ClippingMode", mode);
        probe->asked.clear();
        Ref<Image> got = Render(blur, ImgRectI(10, 10, 20, 20));
        ASSERT_TRUE(got);
        EXPECT_EQ(got->DataWindow(), frame) << "the region does not narrow it either";
        ASSERT_EQ(probe->asked.size(), 1u);
        EXPECT_FALSE(probe->asked[0].has_value()) << "the whole input";
        Ref<Image> shape = Render(blur, std::nullopt, ReqFlagPreCalc);
        EXPECT_EQ(shape->DataWindow(), dw) << "the domain in pre-calculation";
        // The source window is still sent: the frame, or the domain.
        const ImgRectI source = std::string(mode) == "ClippingMode_Frame" ? frame : dw;
        Ref<Image> want = HostBlur(img.Get(), frame,
                                   {{BlurFilterType, BlurVYV5Gaussian},
                                    {BlurXSize, Sent(4, 64)},
                                    {BlurYSize, Sent(4, 64)},
                                    {BlurSourceWindow, &source}});
        EXPECT_TRUE(SamePixels(*got, *want));
    }
}

TEST_F(BlurTool, PassesLockAndChannelsReachTheHost) {
    const ImgRectI frame(0, 0, 50, 40);
    Ref<Image> img = Source(50, 40, frame);
    Operator *blur = Make(img);
    ts::SetID(blur, "Filter", "Multi-box");
    ts::SetNumber(blur, "XBlurSize", Control(6, 50));
    ts::SetNumber(blur, "YBlurSize", Control(2, 50)); // ignored: locked
    ts::SetNumber(blur, "Passes", 2);
    ts::SetNumber(blur, "Green", 0);
    Ref<Image> got = Render(blur);
    ASSERT_TRUE(got);
    const TagList base{{BlurFilterType, BlurMultiBox},
                       {BlurXSize, Sent(6, 50)},
                       {BlurYSize, Sent(6, 50)},
                       {BlurDoGreen, 0},
                       {BlurSourceWindow, &frame}};
    TagList two = base, four = base;
    two.Set({BlurPasses, 2});
    four.Set({BlurPasses, 4});
    EXPECT_TRUE(SamePixels(*got, *HostBlur(img.Get(), got->DataWindow(), two)));
    EXPECT_FALSE(SamePixels(*got, *HostBlur(img.Get(), got->DataWindow(), four)));
    EXPECT_EQ(got->GetFlt(20, 20).G, img->GetFlt(20, 20).G) << "green is off";
    ts::SetNumber(blur, "LockXY", 0);
    Ref<Image> unlocked = Render(blur);
    TagList twoY = two;
    twoY.Set({BlurYSize, Sent(2, 50)});
    EXPECT_TRUE(SamePixels(*unlocked, *HostBlur(img.Get(), unlocked->DataWindow(), twoY)));
}

TEST_F(BlurTool, BlendCountsOnce) {
    // Blend b gives source + (blur - source) b, whether it is set on the
    // common page or on the tool's own; both together multiply.
    const ImgRectI frame(0, 0, 40, 30);
    Ref<Image> img = Source(40, 30, frame);
    Operator *blur = Make(img);
    ts::SetID(blur, "Filter", "Gaussian");
    ts::SetNumber(blur, "XBlurSize", Control(4, 40));
    Ref<Image> full = Render(blur);
    auto check = [&](double b) {
        Ref<Image> got = Render(blur);
        ASSERT_TRUE(got);
        for (int y = 0; y < 30; y += 7)
            for (int x = 0; x < 40; x += 7) {
                const FltPixel s = img->GetFlt(x, y), f = full->GetFlt(x, y), g = got->GetFlt(x, y);
                EXPECT_NEAR(g.R, s.R + (f.R - s.R) * b, 2e-6) << x << "," << y;
                EXPECT_NEAR(g.A, s.A + (f.A - s.A) * b, 2e-6) << x << "," << y;
            }
    };
    ts::SetNumber(blur, "Blend", 0.5);
    check(0.5);
    ts::SetNumber(blur, "Blend", 1.0);
    ts::SetNumber(blur, "BlendClone", 0.25);
    check(0.25);
    ts::SetNumber(blur, "Blend", 0.5);
    check(0.125);
    // The common channel switches still apply after the blur.
    ts::SetNumber(blur, "Blend", 1.0);
    ts::SetNumber(blur, "BlendClone", 1.0);
    ts::SetNumber(blur, "ProcessRed", 0);
    Ref<Image> noRed = Render(blur);
    EXPECT_EQ(noRed->GetFlt(10, 10).R, img->GetFlt(10, 10).R);
    EXPECT_EQ(noRed->GetFlt(10, 10).B, full->GetFlt(10, 10).B);
}

TEST_F(BlurTool, SoftenLoadedFromADocumentIsTheFallbackKernel) {
    // A document read after construction keeps "Soften" as it stands (no
    // button shows it) and the tool blurs with the fallback kernel.
    const std::string text = R"(Orvane.Document {
	Version = 1,
	Tools = {
		Blur1 = Blur { Inputs = { Filter = "Soften", XBlurSize = 36 } },
	},
})";
    OrvaneDoc loaded;
    const DocumentLoadResult result = LoadDocument(text, loaded);
    ASSERT_TRUE(result.error.empty()) << result.error;
    Operator *blur = loaded.FindTool("Blur1");
    ASSERT_NE(blur, nullptr);
    const auto *id = dynamic_cast<const IDValue *>(blur->FindInput("Filter")->Constant().Get());
    ASSERT_NE(id, nullptr);
    EXPECT_EQ(id->value, OvID("Soften"));
    Ref<Image> img = Source(64, 32, ImgRectI(0, 0, 64, 32));
    ProbeSource *src = AddProbe(loaded, img);
    ASSERT_TRUE(blur->FindInput("Input")->ConnectTo(src->FindMainOutput()));
    Ref<Image> got = Render(blur);
    ASSERT_TRUE(got);
    const ImgRectI frame(0, 0, 64, 32);
    EXPECT_TRUE(SamePixels(*got, *HostBlur(img.Get(), got->DataWindow(),
                                           {{BlurFilterType, BlurSoften},
                                            {BlurXSize, 0.05},
                                            {BlurYSize, 0.05},
                                            {BlurPasses, 4},
                                            {BlurSourceWindow, &frame}})));
}

} // namespace
} // namespace Orvane::blurtooltest
