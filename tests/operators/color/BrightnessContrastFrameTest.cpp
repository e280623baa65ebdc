// BrightnessContrast in the processing frame.
#include <algorithm>
#include <cstring>
#include <iterator>
#include <string>

#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "host/core/Registry.h"
#include "host/flow/DataTypes.h"
#include "tests/operators/color/BrightnessContrastReference.h"

namespace Orvane::bctest {
namespace {

class BrightnessContrastFrame : public ::testing::Test {
protected:
    void SetUp() override { Orvane::Test::LoadOperators(); }
};

TEST_F(BrightnessContrastFrame, RegisteredIdentity) {
    const Registry *row = ClassRegistry->Find(OvID("BrightnessContrast"));
    ASSERT_NE(row, nullptr);
    EXPECT_EQ(row->TypeFlags(), RegKindOperator | RegKindTool);
    EXPECT_EQ(row->BaseID(), CLSID_ThreadedOperator);
    EXPECT_STREQ(row->ClassName(), "BrightnessContrast");
    EXPECT_STREQ(row->Tags().GetText(RegPath, ""), "Tools/Color/BrightnessContrast");
    EXPECT_STREQ(row->Tags().GetText(RegAbbreviation, ""), "BC");
    for (Tag on :
         {RegNoMotionBlurControls, RegSupportsRoI, RegProcessesCanvasColor, RegSupportsDoD, RegSupportsGPUImages})
        EXPECT_TRUE(row->Tags().GetBool(on)) << std::hex << on;
    for (Tag off : {RegNoBlendControls, RegNoEffectMask}) EXPECT_FALSE(row->Tags().GetBool(off)) << std::hex << off;
}

TEST_F(BrightnessContrastFrame, InputsInOrderWithTheirControls) {
    OrvaneDoc doc;
    Operator *bc = doc.AddTool(OvID("BrightnessContrast"));
    ASSERT_NE(bc, nullptr);
    struct Expected {
        const char *id, *name, *shown; // shown: the label on the panel
        OvID control;
        double def;
        int group, member; // -1: none
    };
    const Expected expected[] = {
        {"Red", "Red", "", CLSID_InputControl_MultiButton, 1, 12, 0},
        {"Green", "Green", "Green", CLSID_InputControl_MultiButton, 1, 12, 1},
        {"Blue", "Blue", "Blue", CLSID_InputControl_MultiButton, 1, 12, 2},
        {"Alpha", "Alpha", "Alpha", CLSID_InputControl_MultiButton, 0, 12, 3},
        {"Gain", "Gain", "Gain", CLSID_InputControl_Slider, 1, -1, -1},
        {"Lift", "Lift", "Lift", CLSID_InputControl_Slider, 0, -1, -1},
        {"Gamma", "Gamma", "Gamma", CLSID_InputControl_Slider, 1, -1, -1},
        {"Contrast", "Contrast", "Contrast", CLSID_InputControl_Slider, 0, -1, -1},
        {"Brightness", "Brightness", "Brightness", CLSID_InputControl_Slider, 0, -1, -1},
        {"Saturation", "Saturation", "Saturation", CLSID_InputControl_Slider, 1, -1, -1},
        {"Low", "Low", "Low", CLSID_InputControl_Range, 0, 1, 0},
        {"High", "High", "High", CLSID_InputControl_Range, 1, 1, 1},
        {"Direction", "Direction", "Direction", CLSID_InputControl_MultiButton, 0, -1, -1},
        {"ClipBlack", "Clip Black", "Black", CLSID_InputControl_Checkbox, 0, -1, -1},
        {"ClipWhite", "Clip White", "White", CLSID_InputControl_Checkbox, 0, -1, -1},
        {"PreDividePostMultiply", "Pre-Divide / Post-Multiply", "Pre-Divide / Post-Multiply",
         CLSID_InputControl_Checkbox, 0, -1, -1},
    };
    const auto &inputs = bc->Inputs();
    ASSERT_GE(inputs.size(), std::size(expected) + 1);
    for (size_t i = 0; i < std::size(expected); ++i) {
        const Expected &e = expected[i];
        const Input &in = *inputs[i];
        EXPECT_EQ(in.ID(), OvID(e.id)) << i;
        EXPECT_EQ(in.Name(), e.name) << e.id;
        EXPECT_STREQ(in.Label(), e.shown) << e.id;
        EXPECT_EQ(in.DataType(), CLSID_DataType_Number) << e.id;
        EXPECT_EQ(in.Tags().GetID(InputControl), e.control) << e.id;
        const auto *def = dynamic_cast<const Number *>(in.Default().Get());
        ASSERT_NE(def, nullptr) << e.id;
        EXPECT_EQ(def->value, e.def) << e.id;
        EXPECT_EQ(in.Tags().GetLong(ControlGroup, -1), e.group) << e.id;
        EXPECT_EQ(in.Tags().GetLong(ControlMember, -1), e.member) << e.id;
    }
    // The image input is main input 1, after the controls; one main image output.
    EXPECT_EQ(inputs[std::size(expected)]->ID(), OvID("Input"));
    EXPECT_EQ(bc->FindMainInput(1), inputs[std::size(expected)].get());
    EXPECT_EQ(bc->FindMainInput(1)->DataType(), CLSID_DataType_Image);
    ASSERT_NE(bc->FindMainOutput(1), nullptr);
    EXPECT_EQ(bc->FindMainOutput(1)->ID(), OvID("Output"));
    // The host added the clipping mode (main image input with domains).
    EXPECT_NE(bc->FindInput("ClippingMode"), nullptr);

    // Hard limits: typed values below them are raised; the others pass.
    const std::pair<const char *, double> hardMinimum[] = {{"Gamma", 0}, {"Contrast", -1}, {"Saturation", 0}};
    for (const auto &[id, low] : hardMinimum) {
        Orvane::Test::SetNumber(bc, id, low - 3);
        EXPECT_EQ(dynamic_cast<const Number &>(*bc->FindInput(id)->Constant()).value, low) << id;
    }
    Orvane::Test::SetNumber(bc, "Gain", 7.5);
    EXPECT_EQ(dynamic_cast<const Number &>(*bc->FindInput("Gain")->Constant()).value, 7.5);
}

TEST_F(BrightnessContrastFrame, NothingToDoPassesTheSameImage) {
    struct Case {
        const char *name;
        int depth;
        Settings s;
        bool passes;
    };
    const Case cases[] = {
        {"defaults, float", DepthRGBAFlt32, {}, true},
        {"defaults, 16-bit", DepthRGBAInt16, {}, true},
        {"defaults, mask", DepthAFlt32, {}, true},
        {"no channel chosen",
         DepthRGBAFlt32,
         {.gain = 2.0, .gamma = 2.0, .red = false, .green = false, .blue = false},
         true},
        {"gain within eps of 1", DepthRGBAFlt32, {.gain = 1.0 + 5e-8}, true},
        {"clip on integer", DepthRGBAInt16, {.clipBlack = true, .clipWhite = true}, true},
        {"clip on float", DepthRGBAFlt32, {.clipWhite = true}, false},
        {"brightness under one 16-bit step", DepthRGBAInt8, {.brightness = 1e-6}, true},
        {"the same brightness on float", DepthRGBAFlt16, {.brightness = 1e-6}, false},
        {"low under one 16-bit step", DepthRGBAInt16, {.low = 1e-5}, true},
        {"the same low on float", DepthRGBAFlt32, {.low = 1e-5}, false},
        {"high a hair below 1 cuts to 65534", DepthRGBAInt16, {.high = 1.0 - 1e-6}, false},
        {"reverse defaults", DepthRGBAFlt32, {.reverse = true}, true},
        {"pre-divide alone", DepthRGBAInt16, {.prePost = true}, false},
        {"alpha only, gain",
         DepthRGBAFlt32,
         {.gain = 2.0, .red = false, .green = false, .blue = false, .alpha = true},
         false},
    };
    for (const Case &c : cases) {
        Ref<Image> src = Orvane::Test::PatternImage(8, 4, c.depth);
        Rig rig(src);
        Apply(rig.bc, c.s);
        Ref<Image> out = Render(rig.bc);
        ASSERT_TRUE(out) << c.name;
        EXPECT_EQ(out.Get() == src.Get(), c.passes) << c.name;
        Ref<Image> shape = Render(rig.bc, nullptr, ReqFlagPreCalc);
        ASSERT_TRUE(shape) << c.name;
        EXPECT_TRUE(shape->IsNoData()) << c.name;
    }
}

TEST_F(BrightnessContrastFrame, CanvasBeyondTheDataWindow) {
    const ImgRectI inWindow(8, 4, 40, 28);
    const FltPixel canvas{0.2f, 0.4f, 0.6f, 0.8f};
    struct Route {
        const char *name;
        Settings s;
        bool rows;
    };
    const Route routes[] = {{"matrix", {.gain = 1.2, .brightness = 0.1, .saturation = 0.7, .alpha = true}, false},
                            {"rows", {.gain = 1.2, .gamma = 1.5, .saturation = 0.7, .alpha = true}, true},
                            {"rows, reverse", {.gain = 1.2, .gamma = 1.5, .reverse = true}, true}};
    struct Clip {
        const char *mode;
        ImgRectI window;
        bool keepsInputCanvas;
    };
    const Clip clips[] = {{"ClippingMode_None", inWindow, false},
                          {"ClippingMode_Domain", inWindow, true},
                          {"ClippingMode_Frame", ImgRectI(0, 0, 48, 32), true}};
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16})
        for (const Route &route : routes)
            for (const Clip &clip : clips) {
                const std::string what =
                    std::string(route.name) + ", " + clip.mode + ", depth " + std::to_string(depth);
                Ref<Image> src = MakeImage(
                    48, 32, depth,
                    [](int x, int y) {
                        return FltPixel{x / 48.f, y / 32.f, 0.5f, 0.75f};
                    },
                    &inWindow, canvas);
                Rig rig(src);
                Apply(rig.bc, route.s);
                Orvane::Test::SetID(rig.bc, "ClippingMode", clip.mode);
                const Model model(route.s);
                // Integer rows take the 16-bit steps, which clamp between
                // steps; everything else follows the float steps.
                const bool integer = depth == DepthRGBAInt16;
                auto expectedOf = [&](const Px &in) {
                    if (!integer) return model.Float(in);
                    Px out;
                    if (route.rows) {
                        std::array<int64_t, 4> p;
                        for (int c = 0; c < 4; ++c) p[c] = static_cast<int64_t>(in[c] * 65535.0 + 0.5);
                        const auto r = model.Int(p);
                        for (int c = 0; c < 4; ++c) out[c] = r[c] / 65535.0;
                    } else {
                        out = model.Float(in);
                        for (double &v : out) v = std::clamp(v, 0.0, 1.0);
                    }
                    return out;
                };
                // Stored pixels clamp on integer; the matrix's canvas colour does not.
                const Px storedCanvas = expectedOf(ToPx(src->GetCanvasColor()));
                const Px processedCanvas =
                    integer && !route.rows ? model.Float(ToPx(src->GetCanvasColor())) : storedCanvas;
                const double tol = depth == DepthRGBAFlt32 ? 1e-5 : integer ? 4.0 / 65535 : 1e-3;

                for (uint32_t flags : {0u, ReqFlagPreCalc}) {
                    Ref<Image> out = Render(rig.bc, nullptr, flags);
                    ASSERT_TRUE(out) << what;
                    EXPECT_EQ(out->DataWindow(), clip.window) << what;
                    EXPECT_EQ(out->IsNoData(), flags != 0) << what;
                    const Px outCanvas = ToPx(out->GetCanvasColor());
                    for (int c = 0; c < 4; ++c) {
                        if (clip.keepsInputCanvas)
                            EXPECT_EQ(outCanvas[c], ToPx(canvas)[c]) << what;
                        else
                            EXPECT_NEAR(outCanvas[c], processedCanvas[c], tol) << what << " channel " << c;
                    }
                    if (flags) continue;
                    // Rows and columns beyond the input's window hold the
                    // processed canvas; inside, the processed pixels.
                    int mismatches = 0;
                    for (int y = clip.window.y0; y < clip.window.y1; ++y)
                        for (int x = clip.window.x0; x < clip.window.x1; ++x) {
                            const Px got = ToPx(out->GetFlt(x, y));
                            const Px want =
                                inWindow.Contains(x, y) ? expectedOf(ToPx(src->GetFlt(x, y))) : storedCanvas;
                            for (int c = 0; c < 4; ++c) {
                                const double t = integer ? tol : tol * (1 + std::fabs(want[c]));
                                if (std::fabs(got[c] - want[c]) > t && ++mismatches <= 3)
                                    ADD_FAILURE() << what << " at (" << x << ", " << y << ") channel " << c << ": got "
                                                  << got[c] << ", expected " << want[c];
                            }
                        }
                    EXPECT_EQ(mismatches, 0) << what;
                }
            }
}

TEST_F(BrightnessContrastFrame, RegionOfInterestIsTheCropOfTheFullRender) {
    const ImgRectI inWindow(3, 2, 50, 36);
    const Settings routes[] = {{.gain = 1.2, .brightness = 0.1}, {.gamma = 1.3, .saturation = 0.5}};
    const ImgRectI regions[] = {ImgRectI(5, 7, 30, 20), ImgRectI(0, 0, 10, 5), ImgRectI(45, 30, 60, 40)};
    for (const Settings &s : routes)
        for (const char *mode : {"ClippingMode_None", "ClippingMode_Frame"})
            for (const ImgRectI &roi : regions) {
                Ref<Image> src = MakeImage(
                    56, 40, DepthRGBAFlt32,
                    [](int x, int y) {
                        return FltPixel{x / 56.f, y / 40.f, (x ^ y) / 64.f, 0.9f};
                    },
                    &inWindow, FltPixel{0.1f, 0.2f, 0.3f, 0.4f});
                Rig rig(src);
                Apply(rig.bc, s);
                Orvane::Test::SetID(rig.bc, "ClippingMode", mode);
                Ref<Image> full = Render(rig.bc);
                Ref<Image> part = Render(rig.bc, &roi);
                ASSERT_TRUE(full && part);
                const ImgRectI expected = full->DataWindow() & roi;
                EXPECT_EQ(part->DataWindow(), expected) << mode;
                EXPECT_EQ(part->ValidWindow(), expected) << mode;
                EXPECT_EQ(part->GetCanvasColor(), full->GetCanvasColor()) << mode;
                for (int y = expected.y0; y < expected.y1; ++y)
                    EXPECT_EQ(std::memcmp(part->PixelAddress(expected.x0, y), full->PixelAddress(expected.x0, y),
                                          static_cast<size_t>(expected.Width()) * part->BytesPerPixel()),
                              0)
                        << mode << " row " << y;
            }
}

TEST_F(BrightnessContrastFrame, SameBitsWithOneWorkerOrMany) {
    const int before = WorkerCount();
    const Settings settings[] = {{.gain = 1.2, .brightness = 0.1, .saturation = 0.8},
                                 {.gain = 1.1, .gamma = 1.3, .saturation = 0.8, .prePost = true},
                                 {.gamma = 0.7, .low = 0.1, .reverse = true}};
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt8})
        for (const Settings &s : settings) {
            Rig rig(Orvane::Test::PatternImage(300, 270, depth, 5));
            Apply(rig.bc, s);
            SetWorkerCount(1);
            Ref<Image> one = Render(rig.bc);
            SetWorkerCount(std::max(2, before));
            Ref<Image> many = Render(rig.bc);
            SetWorkerCount(before);
            ASSERT_TRUE(one && many);
            ASSERT_NE(one.Get(), many.Get());
            for (int y = 0; y < 270; ++y)
                ASSERT_EQ(std::memcmp(one->ScanLine(y), many->ScanLine(y), one->RowBytes()), 0)
                    << "depth " << depth << " row " << y;
        }
    EXPECT_EQ(WorkerCount(), before);
}

TEST_F(BrightnessContrastFrame, PreCalculationAndAnEmptyRegionMakeNoPixels) {
    const ImgRectI outside(100, 100, 120, 110); // beyond the frame and the data
    for (const Settings &s : {Settings{.gain = 1.2, .brightness = 0.1}, Settings{.gamma = 1.3, .prePost = true}}) {
        Rig rig(Orvane::Test::PatternImage(16, 8));
        Apply(rig.bc, s);
        Ref<Image> shape = Render(rig.bc, nullptr, ReqFlagPreCalc);
        ASSERT_TRUE(shape);
        EXPECT_TRUE(shape->IsNoData());
        EXPECT_FALSE(shape->HasScanLineData());
        EXPECT_EQ(shape->DataWindow(), ImgRectI(0, 0, 16, 8));
        EXPECT_EQ(shape->Depth(), DepthRGBAFlt32);
        EXPECT_EQ(rig.source->processCount, 0) << "pre-calculation asked the source for pixels";
        Ref<Image> out = Render(rig.bc, &outside);
        ASSERT_TRUE(out);
        EXPECT_TRUE(out->DataWindow().IsNull());
        EXPECT_TRUE(out->ValidWindow().IsNull());
    }
}

} // namespace
} // namespace Orvane::bctest
