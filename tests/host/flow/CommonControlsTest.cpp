// The common controls and what PostProcess makes of them, checked pixel by pixel against the mixing rule worked out
// here, over an area reaching beyond every data window so that windows and canvas colours are checked too.
#include <algorithm>
#include <optional>
#include <string>

#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::commoncontrolstest {
namespace ts = ::Orvane::Test;
namespace {

/// Outputs a fixed image given by the test, or passes its input on when it has none. Pre-calculation gives the same
/// windows without pixels.
class Tool : public ThreadedOperator {
public:
    Tool(const Registry *reg, const ScriptVal &args, const TagList &tags, bool withInput = true)
        : ThreadedOperator(reg, args, tags), input(withInput ? ts::AddImageIn(this) : nullptr),
          output(ts::AddImageOut(this)) {}
    void Process(Request *req) override {
        if (!result) return req->SetOutputData(output, req->GetInputData(input));
        if (!req->IsPreCalc()) return req->SetOutputData(output, result);
        const ImgRectI dw = result->DataWindow();
        const FltPixel canvas = result->GetCanvasColor();
        req->SetOutputData(
            output,
            NewImageTagList(
                {{ImgLikeImage, result.Get()}, {ImgDataWindow, &dw}, {ImgNoData, 1}, {ImgCanvasColor, &canvas}}));
    }
    Input *input;
    Output *output;
    Ref<Image> result;
};
struct Generator : Tool {
    Generator(const Registry *reg, const ScriptVal &args, const TagList &tags) : Tool(reg, args, tags, false) {}
};

struct Classes {
    ClassFactory make = &ts::MakeTool<Tool>;
    OvID plain = ts::RegisterTool("CommonTestPlain", make, {{RegSupportsRoI, 1}, {RegSupportsDoD, 1}});
    OvID noBlend = ts::RegisterTool("CommonTestNoBlend", make, {{RegSupportsDoD, 1}, {RegNoBlendControls, 1}});
    OvID noMask = ts::RegisterTool("CommonTestNoMask", make, {{RegSupportsDoD, 1}, {RegNoEffectMask, 1}});
    OvID noDoD = ts::RegisterTool("CommonTestNoDoD", make, {{RegSupportsRoI, 1}});
    OvID bare = ts::RegisterTool("CommonTestBare", make, {{RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
    OvID generator =
        ts::RegisterTool("CommonTestGenerator", &ts::MakeTool<Generator>, {{RegSupportsRoI, 1}, {RegSupportsDoD, 1}});
};
const Classes &C() { return ts::Once<Classes>(); }

TEST(CommonControls, ExistAsTheClassAsksFor) {
    const char *const ids[] = {"Blend",      "ProcessRed",        "ProcessGreen",     "ProcessBlue",    "ProcessAlpha",
                               "EffectMask", "EffectMaskChannel", "EffectMaskInvert", "MultiplyByMask", "ClippingMode"};
    enum { HasBlend = 1, HasMask = 2, HasClipping = 4 };
    for (const auto &[name, cls, has] : {std::tuple{"plain tool", C().plain, HasBlend | HasMask | HasClipping},
                                         {"no blend controls", C().noBlend, HasMask | HasClipping},
                                         {"no effect mask", C().noMask, HasBlend | HasClipping},
                                         {"without domains", C().noDoD, HasBlend | HasMask},
                                         {"without main input", C().generator, HasBlend | HasMask},
                                         {"neither", C().bare, 0}}) {
        SCOPED_TRACE(name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        Operator *op = doc->AddTool(cls, "T1");
        ASSERT_NE(op, nullptr);
        for (int i = 0; i < 10; ++i) // the first five are blend controls, the next four the mask's
            EXPECT_EQ(!op->FindInput(ids[i]), !(has & (i < 5 ? HasBlend : i < 9 ? HasMask : HasClipping))) << ids[i];
        const Operator::CommonInputs &common = op->Common();
        EXPECT_EQ(std::tuple(!common.blend, !common.effectMask, !common.clippingMode),
                  std::tuple(!(has & HasBlend), !(has & HasMask), !(has & HasClipping)));
        const Input *mask = op->FindInput("EffectMask"), *clip = op->FindInput("ClippingMode");
        EXPECT_TRUE(!mask || (mask->Priority() == PriorityMask && !mask->IsRequired() &&
                              mask->DataType() == CLSID_DataType_Mask));
        EXPECT_TRUE(!clip || dynamic_cast<const IDValue &>(*clip->Default()).value == ClippingMode_None);
    }
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

/// The mixed pixel, from the controls' description.
FltPixel Mixed(const MixCase &c, const FltPixel &in, const FltPixel &res, const FltPixel *mask) {
    double m = 1.0;
    if (mask) {
        // Luminance is for grey masks only: the luminance of a grey is its level.
        const float v[] = {mask->A, mask->R, mask->G, mask->B, mask->R};
        m = std::clamp(v[c.channel], 0.f, 1.f);
        if (c.invert) m = 1.0 - m;
    }
    const double i[4] = {in.R, in.G, in.B, in.A}, r[4] = {res.R, res.G, res.B, res.A};
    float o[4];
    for (int ch = 0; ch < 4; ++ch) {
        const double mixed = c.multiply ? i[ch] + (r[ch] * m - i[ch]) * c.blend : i[ch] + (r[ch] - i[ch]) * c.blend * m;
        o[ch] = static_cast<float>(c.process[ch] ? mixed : i[ch]);
    }
    return {o[0], o[1], o[2], o[3]};
}

const std::string Channels[] = {"Red", "Green", "Blue", "Alpha"};

void RunMix(const MixCase &c) {
    SCOPED_TRACE(c.name);
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Ref<Image> src = ts::WindowedImage(16, 12, c.srcWindow, c.srcCanvas, 11);
    Ref<Image> res = ts::WindowedImage(16, 12, c.resWindow, c.resCanvas, 12);
    Ref<Image> mask;
    if (c.mask == RGBAMask) mask = ts::WindowedImage(16, 12, c.maskWindow, c.maskCanvas, 13);
    if (c.mask == SingleChannelMask) mask = ts::WindowedImage(16, 12, c.maskWindow, c.maskCanvas, 14, DepthAFlt32);
    if (c.mask == GreyRGBAMask) { // R = G = B, alpha differs
        mask = ts::WindowedImage(16, 12, c.maskWindow, c.maskCanvas, 21);
        for (int y = c.maskWindow.y0; y < c.maskWindow.y1; ++y)
            for (int x = c.maskWindow.x0; x < c.maskWindow.x1; ++x) {
                const FltPixel p = mask->GetFlt(x, y);
                mask->PutFlt(x, y, {p.R, p.R, p.R, p.G});
            }
    }
    auto *tool = dynamic_cast<Tool *>(doc->AddTool(c.generator ? C().generator : C().plain, "Mix1"));
    ASSERT_NE(tool, nullptr);
    tool->result = res;
    ASSERT_TRUE(c.generator || tool->input->ConnectTo(ts::AddImageSource(*doc, "Src", src)->Out()));
    ASSERT_TRUE(!mask || tool->Common().effectMask->ConnectTo(ts::AddImageSource(*doc, "MaskSrc", mask)->Out()));
    for (int ch = 0; ch < 4; ++ch) ts::SetNumber(tool, ("Process" + Channels[ch]).c_str(), c.process[ch]);
    ts::SetNumbers(tool, {{"Blend", c.blend}, {"EffectMaskChannel", c.channel}});
    ts::SetNumbers(tool, {{"EffectMaskInvert", c.invert}, {"MultiplyByMask", c.multiply}});
    Ref<Image> out = ts::EvalImage(tool, 0.0, c.roi ? &*c.roi : nullptr);
    ASSERT_TRUE(out);
    EXPECT_EQ(ts::ConsoleText(*doc), "");
    const Image *in = c.generator ? nullptr : src.Get();
    // The canvas follows the same rule as the pixels.
    ts::ExpectPixelNear(out->GetCanvasColor(),
                        Mixed(c, in ? c.srcCanvas : FltPixel{}, c.resCanvas, mask ? &c.maskCanvas : nullptr), 2e-6,
                        "canvas");
    // Every pixel, inside and around every window.
    const ImgRectI area = c.roi ? *c.roi : ImgRectI(-3, -3, 19, 15);
    for (int y = area.y0; y < area.y1; ++y)
        for (int x = area.x0; x < area.x1; ++x) {
            const FltPixel m = mask ? mask->GetFlt(x, y) : FltPixel{};
            const FltPixel want = Mixed(c, in ? in->GetFlt(x, y) : FltPixel{}, res->GetFlt(x, y), mask ? &m : nullptr);
            ts::ExpectPixelNear(out->GetFlt(x, y), want, 2e-6, std::to_string(x) + "," + std::to_string(y));
            if (::testing::Test::HasFailure()) return;
        }
    EXPECT_TRUE(!c.roi || c.roi->Contains(out->DataWindow())) << ts::RectText(out->DataWindow());
}

TEST(CommonControls, BlendChannelSwitchesAndTheEffectMaskMixResultAndInputAndWindowsGrowWhereNeeded) {
    const FltPixel opaque{0.5f, 0.25f, 0.f, 1.f};
    const MixCase cases[] = {
        {.name = "blend 0.25", .blend = 0.25},
        {.name = "blend 0", .blend = 0.0},
        {.name = "wider", .blend = 0.25, .srcWindow = {4, 4, 8, 8}, .resWindow = {0, 0, 16, 12}, .srcCanvas = opaque},
        {.name = "red and alpha off", .process = {false, true, true, false}},
        {.name = "green off, blend 0.6", .blend = 0.6, .process = {true, false, true, true}},
        {.name = "all off", .blend = 0.6, .process = {false, false, false, false}},
        {.name = "alpha mask", .mask = RGBAMask},
        {.name = "red mask, blend 0.7", .blend = 0.7, .mask = RGBAMask, .channel = 1},
        {.name = "green mask, inverted", .mask = RGBAMask, .channel = 2, .invert = true},
        {.name = "blue mask", .mask = RGBAMask, .channel = 3},
        {.name = "luminance of a grey mask", .mask = GreyRGBAMask, .channel = 4},
        {.name = "luminance, inverted", .blend = 0.4, .mask = GreyRGBAMask, .channel = 4, .invert = true},
        {.name = "single-channel mask, green", .mask = SingleChannelMask, .channel = 2},
        {.name = "multiply by mask", .mask = RGBAMask, .multiply = true},
        {.name = "times inverted red", .blend = 0.5, .mask = RGBAMask, .channel = 1, .invert = true, .multiply = true},
        {.name = "generator, masked", .mask = RGBAMask, .channel = 1, .generator = true},
        {.name = "generator: mixed with transparent black", .blend = 0.25, .generator = true},
        {.name = "region", .blend = 0.5, .mask = RGBAMask, .roi = ImgRectI(2, 3, 9, 8)},
    };
    for (const MixCase &c : cases) RunMix(c);
    const FltPixel clear{}, grey{0.3f, 0.2f, 0.1f, 0.5f};
    for (const bool multiply : {false, true})
        for (const FltPixel &srcCanvas : {clear, grey}) {
            // A mask reaching beyond the input and the result on every side.
            const MixCase c{.name = multiply ? "multiplied by the mask" : "plain mask",
                            .blend = 0.8,
                            .mask = RGBAMask,
                            .multiply = multiply,
                            .srcWindow = {4, 3, 9, 8},
                            .resWindow = {5, 4, 11, 9},
                            .maskWindow = {-2, -1, 17, 13},
                            .srcCanvas = srcCanvas,
                            .resCanvas = grey,
                            .maskCanvas = {0.f, 0.f, 0.f, 0.25f}};
            SCOPED_TRACE(srcCanvas == grey ? "equal canvases" : "different canvases");
            RunMix(c);
        }
}

TEST(CommonControls, UntouchedResultsAndPassedThroughInputsAreHandedOnAsTheyAre) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Ref<Image> src = ts::WindowedImage(16, 12, {1, 1, 13, 10}, {0.1f, 0.1f, 0.1f, 0.1f}, 31);
    auto *pass = dynamic_cast<Tool *>(doc->AddTool(C().plain, "Pass1"));
    auto *plain = dynamic_cast<Tool *>(doc->AddTool(C().plain, "Plain1"));
    ASSERT_TRUE(pass && plain);
    ASSERT_TRUE(pass->input->ConnectTo(ts::AddImageSource(*doc, "Src", src)->Out()));
    ASSERT_TRUE(plain->input->ConnectTo(pass->output));
    ASSERT_TRUE(
        pass->Common().effectMask->ConnectTo(ts::AddImageSource(*doc, "Mask", ts::PatternImage(16, 12))->Out()));
    ts::SetNumbers(pass, {{"Blend", 0.25}, {"ProcessGreen", 0}});
    EXPECT_EQ(ts::EvalImage(pass).Get(), src.Get()) << "an input passed on is left alone";
    plain->result = ts::WindowedImage(16, 12, {3, 2, 15, 11}, {0.2f, 0.4f, 0.1f, 0.5f}, 41);
    EXPECT_EQ(ts::EvalImage(plain).Get(), plain->result.Get()) << "the defaults leave the result as it is";
}

} // namespace
} // namespace Orvane::commoncontrolstest
