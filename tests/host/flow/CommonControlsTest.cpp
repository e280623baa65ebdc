// The common controls the host adds to tools (Blend, the channel switches,
// the effect mask) and what PostProcess makes of them, checked pixel by pixel
// against the mixing rule worked out here, over an area reaching beyond
// every data window so that windows and canvas colours are checked too.
#include <algorithm>
#include <cmath>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::commoncontrolstest {
namespace ts = ::Orvane::Test;
namespace {

std::string R(const ImgRectI &r) {
    return "(" + std::to_string(r.x0) + "," + std::to_string(r.y0) + "," + std::to_string(r.x1) + "," +
           std::to_string(r.y1) + ")";
}

/// Outputs a fixed image given by the test, or passes its input on when it
/// has none. Pre-calculation gives the same windows without pixels.
class FixedTool : public ThreadedOperator {
public:
    FixedTool(const Registry *reg, const ScriptVal &args, const TagList &tags, bool withInput)
        : ThreadedOperator(reg, args, tags) {
        if (withInput) input = AddInputTagList("Input", "Input", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
        output = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        if (!result) {
            req->SetOutputData(output, req->GetInputData(input));
            return;
        }
        if (req->IsPreCalc()) {
            const ImgRectI dw = result->DataWindow();
            const FltPixel canvas = result->GetCanvasColor();
            req->SetOutputData(
                output,
                NewImageTagList(
                    {{ImgLikeImage, result.Get()}, {ImgDataWindow, &dw}, {ImgNoData, 1}, {ImgCanvasColor, &canvas}}));
            return;
        }
        req->SetOutputData(output, result);
    }
    Input *input = nullptr;
    Output *output;
    Ref<Image> result;
};

Object *MakeWithInput(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new FixedTool(reg, args, tags, true);
}
Object *MakeGenerator(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new FixedTool(reg, args, tags, false);
}

OvID Register(const char *id, ClassFactory make, std::initializer_list<TagItem> attrs) {
    TagList tags{{RegConstructor, make}, {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)}};
    for (const TagItem &a : attrs) tags.Set(a);
    Registry::_Init(&ClassRegistry, OvID(id), tags);
    return OvID(id);
}

struct Classes {
    OvID plain = Register("CommonTestPlain", &MakeWithInput, {{RegSupportsRoI, 1}, {RegSupportsDoD, 1}});
    OvID noBlend = Register("CommonTestNoBlend", &MakeWithInput, {{RegSupportsDoD, 1}, {RegNoBlendControls, 1}});
    OvID noMask = Register("CommonTestNoMask", &MakeWithInput, {{RegSupportsDoD, 1}, {RegNoEffectMask, 1}});
    OvID noDoD = Register("CommonTestNoDoD", &MakeWithInput, {{RegSupportsRoI, 1}});
    OvID bare = Register("CommonTestBare", &MakeWithInput, {{RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
    OvID generator = Register("CommonTestGenerator", &MakeGenerator, {{RegSupportsRoI, 1}, {RegSupportsDoD, 1}});
};
const Classes &C() {
    static const Classes classes;
    return classes;
}

const char *const CommonIDs[] = {"Blend",          "ProcessRed",  "ProcessGreen",      "ProcessBlue",
                                 "ProcessAlpha",   "EffectMask",  "EffectMaskChannel", "EffectMaskInvert",
                                 "MultiplyByMask", "ClippingMode"};
enum { HasBlend = 1, HasMask = 2, HasClipping = 4 };

TEST(CommonControls, ExistAsTheClassAsksFor) {
    struct Case {
        const char *name;
        OvID cls;
        int has;
    };
    const Case cases[] = {
        {"plain tool", C().plain, HasBlend | HasMask | HasClipping},
        {"no blend controls", C().noBlend, HasMask | HasClipping},
        {"no effect mask", C().noMask, HasBlend | HasClipping},
        {"without domains", C().noDoD, HasBlend | HasMask},
        {"without main input", C().generator, HasBlend | HasMask},
        {"neither", C().bare, 0},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        Operator *op = doc->AddTool(c.cls, "T1");
        ASSERT_NE(op, nullptr);
        for (int i = 0; i < 10; ++i) {
            const int group = i < 5 ? HasBlend : i < 9 ? HasMask : HasClipping;
            EXPECT_EQ(op->FindInput(CommonIDs[i]) != nullptr, (c.has & group) != 0) << CommonIDs[i];
        }
        EXPECT_EQ(op->Common().blend != nullptr, (c.has & HasBlend) != 0);
        EXPECT_EQ(op->Common().effectMask != nullptr, (c.has & HasMask) != 0);
        EXPECT_EQ(op->Common().clippingMode != nullptr, (c.has & HasClipping) != 0);
        if (Input *mask = op->FindInput("EffectMask")) {
            EXPECT_EQ(mask->Priority(), PriorityMask);
            EXPECT_FALSE(mask->IsRequired());
            EXPECT_EQ(mask->DataType(), CLSID_DataType_Mask);
        }
        if (Input *blend = op->FindInput("Blend")) {
            auto *def = dynamic_cast<const Number *>(blend->Default().Get());
            ASSERT_NE(def, nullptr);
            EXPECT_EQ(def->value, 1.0);
            ASSERT_TRUE(blend->SetValue(MakeRef<Number>(1.5)));
            EXPECT_EQ(dynamic_cast<const Number &>(*blend->Constant()).value, 1.0) << "Blend stays within 0..1";
            ASSERT_TRUE(blend->SetValue(MakeRef<Number>(-0.5)));
            EXPECT_EQ(dynamic_cast<const Number &>(*blend->Constant()).value, 0.0);
        }
        if (Input *clip = op->FindInput("ClippingMode")) {
            auto *def = dynamic_cast<const IDValue *>(clip->Default().Get());
            ASSERT_NE(def, nullptr);
            EXPECT_EQ(def->value, ClippingMode_None);
        }
    }
}

// ---- PostProcess -----------------------------------------------------------

/// An RGBA float image of the pattern over `dw` with a canvas colour.
Ref<Image> Windowed(const ImgRectI &dw, FltPixel canvas, unsigned seed, int depth = 8) {
    Ref<Image> pattern = ts::PatternImage(dw.Width(), dw.Height(), 8, seed);
    Ref<Image> img = NewImageTagList(
        {{ImgWidth, 16}, {ImgHeight, 12}, {ImgDepth, depth}, {ImgDataWindow, &dw}, {ImgCanvasColor, &canvas}});
    img->AllocScanLineData();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) img->PutFlt(x, y, pattern->GetFlt(x - dw.x0, y - dw.y0));
    return img;
}

/// A grey RGBA mask (R = G = B) whose alpha differs.
Ref<Image> GreyMask(const ImgRectI &dw, FltPixel canvas) {
    Ref<Image> img = Windowed(dw, canvas, 21);
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const FltPixel p = img->GetFlt(x, y);
            img->PutFlt(x, y, {p.R, p.R, p.R, p.G});
        }
    return img;
}

enum MaskKind { NoMask, RGBAMask, GreyRGBAMask, SingleChannelMask };

struct MixCase {
    const char *name;
    double blend = 1.0;
    bool process[4] = {true, true, true, true};
    MaskKind mask = NoMask;
    int channel = 0; ///< Alpha, Red, Green, Blue, Luminance
    bool invert = false;
    bool multiply = false;
    bool generator = false; ///< a tool without main input
    ImgRectI srcWindow{1, 1, 13, 10}, resWindow{3, 2, 15, 11}, maskWindow{0, 4, 16, 8};
    FltPixel srcCanvas{0.f, 0.f, 0.f, 0.f}, resCanvas{0.2f, 0.4f, 0.1f, 0.5f}, maskCanvas{0.f, 0.f, 0.f, 0.f};
    std::optional<ImgRectI> roi = std::nullopt;
};

/// The mask weight at one pixel, from the control's description.
float MaskWeight(const MixCase &c, const FltPixel &p) {
    float v = 0.f;
    switch (c.channel) {
    case 0: v = p.A; break;
    case 1: v = p.R; break;
    case 2: v = p.G; break;
    case 3: v = p.B; break;
    case 4: v = p.R; break; // grey masks only: luminance of a grey is its level
    }
    v = std::clamp(v, 0.f, 1.f);
    return c.invert ? 1.f - v : v;
}

FltPixel Mixed(const MixCase &c, const FltPixel &in, const FltPixel &res, const FltPixel *mask) {
    const double m = mask ? MaskWeight(c, *mask) : 1.0;
    const double i[4] = {in.R, in.G, in.B, in.A}, r[4] = {res.R, res.G, res.B, res.A};
    double o[4];
    for (int ch = 0; ch < 4; ++ch) {
        if (!c.process[ch])
            o[ch] = i[ch];
        else if (c.multiply)
            o[ch] = i[ch] + (r[ch] * m - i[ch]) * c.blend;
        else
            o[ch] = i[ch] + (r[ch] - i[ch]) * c.blend * m;
    }
    return {static_cast<float>(o[0]), static_cast<float>(o[1]), static_cast<float>(o[2]), static_cast<float>(o[3])};
}

void ExpectNear(const FltPixel &got, const FltPixel &want, const std::string &where) {
    const float tol = 2e-6f;
    EXPECT_NEAR(got.R, want.R, tol) << where;
    EXPECT_NEAR(got.G, want.G, tol) << where;
    EXPECT_NEAR(got.B, want.B, tol) << where;
    EXPECT_NEAR(got.A, want.A, tol) << where;
}

void RunMix(const MixCase &c) {
    SCOPED_TRACE(c.name);
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Ref<Image> src = Windowed(c.srcWindow, c.srcCanvas, 11);
    Ref<Image> res = Windowed(c.resWindow, c.resCanvas, 12);
    Ref<Image> mask;
    if (c.mask == RGBAMask) mask = Windowed(c.maskWindow, c.maskCanvas, 13);
    if (c.mask == GreyRGBAMask) mask = GreyMask(c.maskWindow, c.maskCanvas);
    if (c.mask == SingleChannelMask) mask = Windowed(c.maskWindow, c.maskCanvas, 14, 4);

    auto *tool = dynamic_cast<FixedTool *>(doc->AddTool(c.generator ? C().generator : C().plain, "Mix1"));
    ASSERT_NE(tool, nullptr);
    tool->result = res;
    if (!c.generator) {
        ts::ImageSourceTool *s = ts::AddImageSource(*doc, "Src", src);
        ASSERT_TRUE(tool->input->ConnectTo(s->Out()));
    }
    if (mask) {
        ts::ImageSourceTool *m = ts::AddImageSource(*doc, "MaskSrc", mask);
        ASSERT_TRUE(tool->Common().effectMask->ConnectTo(m->Out()));
    }
    ts::SetNumber(tool, "Blend", c.blend);
    const char *const channels[4] = {"ProcessRed", "ProcessGreen", "ProcessBlue", "ProcessAlpha"};
    for (int ch = 0; ch < 4; ++ch) ts::SetNumber(tool, channels[ch], c.process[ch] ? 1.0 : 0.0);
    ts::SetNumber(tool, "EffectMaskChannel", c.channel);
    ts::SetNumber(tool, "EffectMaskInvert", c.invert ? 1.0 : 0.0);
    ts::SetNumber(tool, "MultiplyByMask", c.multiply ? 1.0 : 0.0);

    Ref<Image> out = ts::EvalImage(tool, 0.0, c.roi ? &*c.roi : nullptr);
    ASSERT_TRUE(out);
    EXPECT_TRUE(doc->ConsoleLines().empty());
    const Image *in = c.generator ? nullptr : src.Get();
    const FltPixel clear{};

    // The canvas follows the same rule as the pixels.
    const FltPixel maskCanvas = c.maskCanvas;
    ExpectNear(out->GetCanvasColor(), Mixed(c, in ? c.srcCanvas : clear, c.resCanvas, mask ? &maskCanvas : nullptr),
               "canvas");
    // Every pixel, inside and around every window.
    const ImgRectI area = c.roi ? *c.roi : ImgRectI(-3, -3, 19, 15);
    for (int y = area.y0; y < area.y1; ++y)
        for (int x = area.x0; x < area.x1; ++x) {
            const FltPixel m = mask ? mask->GetFlt(x, y) : FltPixel{};
            const FltPixel want = Mixed(c, in ? in->GetFlt(x, y) : clear, res->GetFlt(x, y), mask ? &m : nullptr);
            ExpectNear(out->GetFlt(x, y), want, std::to_string(x) + "," + std::to_string(y));
            if (::testing::Test::HasFailure()) return;
        }
    if (c.roi) {
        EXPECT_TRUE(c.roi->Contains(out->DataWindow())) << R(out->DataWindow());
    }
}

TEST(CommonControls, BlendMixesResultAndInput) {
    MixCase c{"blend 0.25"};
    c.blend = 0.25;
    RunMix(c);
    c.name = "blend 0";
    c.blend = 0.0;
    RunMix(c);
    c.name = "blend 0.25, result window larger than the input's";
    c.blend = 0.25;
    c.srcWindow = {4, 4, 8, 8};
    c.resWindow = {0, 0, 16, 12};
    c.srcCanvas = {0.5f, 0.25f, 0.f, 1.f};
    RunMix(c);
}

TEST(CommonControls, ChannelsSwitchedOffKeepTheInput) {
    MixCase c{"red and alpha off"};
    c.process[0] = c.process[3] = false;
    RunMix(c);
    c.name = "green off, blend 0.6";
    c.process[0] = c.process[3] = true;
    c.process[1] = false;
    c.blend = 0.6;
    RunMix(c);
    c.name = "all off";
    for (bool &p : c.process) p = false;
    RunMix(c);
}

TEST(CommonControls, TheEffectMaskWeighsTheResult) {
    struct Row {
        const char *name;
        MaskKind kind;
        int channel;
        bool invert, multiply;
        double blend;
    };
    const Row rows[] = {
        {"alpha", RGBAMask, 0, false, false, 1.0},
        {"red, blend 0.7", RGBAMask, 1, false, false, 0.7},
        {"green, inverted", RGBAMask, 2, true, false, 1.0},
        {"blue", RGBAMask, 3, false, false, 1.0},
        {"luminance of a grey mask", GreyRGBAMask, 4, false, false, 1.0},
        {"luminance, inverted, blend 0.4", GreyRGBAMask, 4, true, false, 0.4},
        {"single-channel mask, green", SingleChannelMask, 2, false, false, 1.0},
        {"multiply by mask", RGBAMask, 0, false, true, 1.0},
        {"multiply by an inverted mask, blend 0.5", RGBAMask, 1, true, true, 0.5},
    };
    for (const Row &r : rows) {
        MixCase c{r.name};
        c.mask = r.kind;
        c.channel = r.channel;
        c.invert = r.invert;
        c.multiply = r.multiply;
        c.blend = r.blend;
        RunMix(c);
    }
}

TEST(CommonControls, DataWindowsGrowWhereTheMixNeedsThem) {
    struct Row {
        const char *name;
        bool multiply;
        FltPixel srcCanvas, resCanvas;
    };
    const FltPixel grey{0.3f, 0.2f, 0.1f, 0.5f};
    const Row rows[] = {
        {"different canvases", false, {0.f, 0.f, 0.f, 0.f}, grey},
        {"equal canvases", false, grey, grey},
        {"equal canvases, multiplied by the mask", true, grey, grey},
        {"different canvases, multiplied by the mask", true, {0.f, 0.f, 0.f, 0.f}, grey},
    };
    for (const Row &r : rows) {
        // A mask reaching beyond the input and the result on every side.
        MixCase c{r.name};
        c.mask = RGBAMask;
        c.multiply = r.multiply;
        c.blend = 0.8;
        c.srcWindow = {4, 3, 9, 8};
        c.resWindow = {5, 4, 11, 9};
        c.maskWindow = {-2, -1, 17, 13};
        c.srcCanvas = r.srcCanvas;
        c.resCanvas = r.resCanvas;
        c.maskCanvas = {0.f, 0.f, 0.f, 0.25f};
        RunMix(c);
    }
}

TEST(CommonControls, ARegionOfInterestLimitsTheMix) {
    MixCase c{"region"};
    c.mask = RGBAMask;
    c.blend = 0.5;
    c.roi = ImgRectI(2, 3, 9, 8);
    RunMix(c);
}

TEST(CommonControls, AToolWithoutMainInputMixesWithTransparentBlack) {
    MixCase c{"generator, blend 0.25"};
    c.generator = true;
    c.blend = 0.25;
    RunMix(c);
    c.name = "generator, masked";
    c.blend = 1.0;
    c.mask = RGBAMask;
    c.channel = 1;
    RunMix(c);
}

TEST(CommonControls, APassedThroughInputIsLeftAlone) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Ref<Image> src = Windowed({1, 1, 13, 10}, {0.1f, 0.1f, 0.1f, 0.1f}, 31);
    auto *tool = dynamic_cast<FixedTool *>(doc->AddTool(C().plain, "Pass1"));
    ASSERT_NE(tool, nullptr);
    ASSERT_TRUE(tool->input->ConnectTo(ts::AddImageSource(*doc, "Src", src)->Out()));
    ASSERT_TRUE(
        tool->Common().effectMask->ConnectTo(ts::AddImageSource(*doc, "MaskSrc", ts::PatternImage(16, 12))->Out()));
    ts::SetNumber(tool, "Blend", 0.25);
    ts::SetNumber(tool, "ProcessGreen", 0);
    Ref<Image> out = ts::EvalImage(tool);
    EXPECT_EQ(out.Get(), src.Get());
}

TEST(CommonControls, DefaultsLeaveTheResultAsItIs) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    auto *tool = dynamic_cast<FixedTool *>(doc->AddTool(C().plain, "Plain1"));
    ASSERT_NE(tool, nullptr);
    tool->result = Windowed({3, 2, 15, 11}, {0.2f, 0.4f, 0.1f, 0.5f}, 41);
    ASSERT_TRUE(tool->input->ConnectTo(ts::AddImageSource(*doc, "Src", ts::PatternImage(16, 12))->Out()));
    Ref<Image> out = ts::EvalImage(tool);
    EXPECT_EQ(out.Get(), tool->result.Get());
}

} // namespace
} // namespace Orvane::commoncontrolstest
