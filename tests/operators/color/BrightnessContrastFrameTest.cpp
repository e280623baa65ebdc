// BrightnessContrast in the processing frame: pass-through, pre-calculation,
// canvas and windows under each clipping mode, regions, workers and row functions.
#include <algorithm>
#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "tests/operators/color/BrightnessContrastReference.h"

namespace Orvane::bctest {
namespace {

class BrightnessContrastFrame : public ::testing::Test {
protected:
    void SetUp() override { Orvane::Test::LoadOperators(); }
};

TEST_F(BrightnessContrastFrame, DefaultsAndHardLimits) {
    OrvaneDoc doc;
    Operator *bc = doc.AddTool(OvID("BrightnessContrast"));
    ASSERT_NE(bc, nullptr);
    for (const auto &[id, value] : Values(Settings{}))
        EXPECT_EQ(dynamic_cast<const Number &>(*bc->FindInput(id)->Default()).value, value) << id;
    // Typed values below the hard limits are raised; there is no upper one.
    auto value = [&](const char *id) { return dynamic_cast<const Number &>(*bc->FindInput(id)->Constant()).value; };
    for (const auto &[id, low] : {std::pair{"Gamma", 0.0}, {"Contrast", -1.0}, {"Saturation", 0.0}}) {
        Orvane::Test::SetNumber(bc, id, low - 3);
        EXPECT_EQ(value(id), low) << id;
    }
    Orvane::Test::SetNumber(bc, "Gain", 7.5);
    EXPECT_EQ(value("Gain"), 7.5);
}

TEST_F(BrightnessContrastFrame, NothingToDoPassesTheSameImageAndPreCalculationMakesNoPixels) {
    struct Case {
        const char *name;
        int depth;
        bool passes;
        Settings s;
    };
    const Settings noChannel{.gain = 2.0, .gamma = 2.0, .red = false, .green = false, .blue = false};
    const Settings alphaGain{.gain = 2.0, .red = false, .green = false, .blue = false, .alpha = true};
    const Case cases[] = {
        {"defaults, float", DepthRGBAFlt32, true, {}},
        {"defaults, 16-bit", DepthRGBAInt16, true, {}},
        {"defaults, mask", DepthAFlt32, true, {}},
        {"no channel chosen", DepthRGBAFlt32, true, noChannel},
        {"gain within eps of 1", DepthRGBAFlt32, true, {.gain = 1.0 + 5e-8}},
        {"clip on integer", DepthRGBAInt16, true, {.clipBlack = true, .clipWhite = true}},
        {"clip on float", DepthRGBAFlt32, false, {.clipWhite = true}},
        {"brightness under one 16-bit step", DepthRGBAInt8, true, {.brightness = 1e-6}},
        {"the same brightness on float", DepthRGBAFlt16, false, {.brightness = 1e-6}},
        {"low under one 16-bit step", DepthRGBAInt16, true, {.low = 1e-5}},
        {"the same low on float", DepthRGBAFlt32, false, {.low = 1e-5}},
        {"high a hair below 1 cuts to 65534", DepthRGBAInt16, false, {.high = 1.0 - 1e-6}},
        {"reverse defaults", DepthRGBAFlt32, true, {.reverse = true}},
        {"pre-divide alone", DepthRGBAInt16, false, {.prePost = true}},
        {"alpha only, gain", DepthRGBAFlt32, false, alphaGain},
        {"matrix route", DepthRGBAFlt32, false, {.gain = 1.2, .brightness = 0.1}},
        {"row route", DepthRGBAFlt32, false, {.gamma = 1.3, .prePost = true}},
    };
    const ImgRectI outside(100, 100, 120, 110); // beyond the frame and the data
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<Image> src = Orvane::Test::PatternImage(8, 4, c.depth);
        Rig rig(src);
        Apply(rig.bc, c.s);
        Ref<Image> shape = Render(rig.bc, nullptr, ReqFlagPreCalc);
        ASSERT_TRUE(shape);
        EXPECT_TRUE(shape->IsNoData() && !shape->HasScanLineData());
        EXPECT_EQ(shape->DataWindow(), ImgRectI(0, 0, 8, 4));
        EXPECT_EQ(shape->Depth(), c.depth);
        EXPECT_EQ(rig.source->processCount, 0) << "pre-calculation asked the source for pixels";
        Ref<Image> out = Render(rig.bc);
        ASSERT_TRUE(out);
        EXPECT_EQ(out.Get() == src.Get(), c.passes);
        if (c.passes) continue;
        Ref<Image> none = Render(rig.bc, &outside);
        ASSERT_TRUE(none);
        EXPECT_TRUE(none->DataWindow().IsNull() && none->ValidWindow().IsNull());
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
                auto fill = [](int x, int y) { return FltPixel{x / 48.f, y / 32.f, 0.5f, 0.75f}; };
                Ref<Image> src = MakeImage(48, 32, depth, fill, &inWindow, canvas);
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
    auto fill = [](int x, int y) { return FltPixel{x / 56.f, y / 40.f, (x ^ y) / 64.f, 0.9f}; };
    const Ref<Image> src = MakeImage(56, 40, DepthRGBAFlt32, fill, &inWindow, FltPixel{0.1f, 0.2f, 0.3f, 0.4f});
    for (const Settings &s : {Settings{.gain = 1.2, .brightness = 0.1}, Settings{.gamma = 1.3, .saturation = 0.5}})
        for (const char *mode : {"ClippingMode_None", "ClippingMode_Frame"})
            for (const ImgRectI &roi : {ImgRectI(5, 7, 30, 20), ImgRectI(0, 0, 10, 5), ImgRectI(45, 30, 60, 40)}) {
                SCOPED_TRACE(mode);
                Rig rig(src);
                Apply(rig.bc, s);
                Orvane::Test::SetID(rig.bc, "ClippingMode", mode);
                Ref<Image> full = Render(rig.bc), part = Render(rig.bc, &roi);
                ASSERT_TRUE(full && part);
                const ImgRectI expected = full->DataWindow() & roi;
                EXPECT_EQ(part->DataWindow(), expected);
                EXPECT_EQ(part->ValidWindow(), expected);
                EXPECT_EQ(part->GetCanvasColor(), full->GetCanvasColor());
                for (int y = expected.y0; y < expected.y1; ++y)
                    EXPECT_EQ(std::memcmp(part->PixelAddress(expected.x0, y), full->PixelAddress(expected.x0, y),
                                          static_cast<size_t>(expected.Width()) * part->BytesPerPixel()),
                              0)
                        << "row " << y;
            }
}

TEST_F(BrightnessContrastFrame, SameBitsWithOneWorkerOrManyAndEitherRowFunction) {
    const int before = WorkerCount();
    const Settings settings[] = {{.gain = 1.2, .brightness = 0.1, .saturation = 0.8},
                                 {.gain = 1.1, .gamma = 1.3, .saturation = 0.8, .prePost = true},
                                 {.gamma = 0.7, .low = 0.1, .reverse = true}};
    auto expectSame = [](const Ref<Image> &a, const Ref<Image> &b, const std::string &what) {
        ASSERT_TRUE(a && b && a.Get() != b.Get()) << what;
        for (int y = 0; y < a->Height(); ++y)
            ASSERT_EQ(std::memcmp(a->ScanLine(y), b->ScanLine(y), a->RowBytes()), 0) << what << " row " << y;
    };
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt8})
        for (const Settings &s : settings) {
            Rig rig(Orvane::Test::PatternImage(300, 270, depth, 5));
            Apply(rig.bc, s);
            AppSwitches vector(true, true);
            SetWorkerCount(1);
            Ref<Image> one = Render(rig.bc);
            SetWorkerCount(std::max(2, before));
            Ref<Image> many = Render(rig.bc);
            SetWorkerCount(before);
            expectSame(one, many, "workers, depth " + std::to_string(depth));
            if (depth == DepthRGBAInt8) continue;
            // The vector rows and the general ones give the same bits.
            AppSwitches general(true, false);
            expectSame(many, Render(rig.bc), "row functions, depth " + std::to_string(depth));
        }
    EXPECT_EQ(WorkerCount(), before);
}

} // namespace
} // namespace Orvane::bctest
