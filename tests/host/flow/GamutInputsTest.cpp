#include "host/flow/GamutInputs.h"

#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::gamutinputstest {
namespace {
namespace ts = ::Orvane::Test;

/// A tool that carries a GamutInputs group and forwards its notifications.
template <GamutInputs::Direction Dir> class GamutTool : public Operator {
public:
    GamutTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : Operator(reg, args, tags) {
        AddControlPageTagList("Controls", {});
        AddInputTagList("Depth", "Depth", {{LinkDataType, CLSID_DataType_Number}});
        gamut = std::make_unique<GamutInputs>(this, Dir);
        AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override {
        gamut->NotifyChanged(in, param, time);
        Operator::NotifyChanged(in, param, time, tags);
    }
    std::unique_ptr<GamutInputs> gamut;
};

float Decode(float v) { return static_cast<float>(v <= 0.04045 ? v / 12.92 : std::pow((v + 0.055) / 1.055, 2.4)); }

struct Fixture {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Operator *tool;
    GamutInputs *gamut;
    explicit Fixture(bool toLinear) {
        static const OvID loader = ts::RegisterTool("GamutTestLoader", &ts::MakeTool<GamutTool<GamutInputs::ToLinear>>,
                                                    {{RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
        static const OvID saver = ts::RegisterTool("GamutTestSaver", &ts::MakeTool<GamutTool<GamutInputs::FromLinear>>,
                                                   {{RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
        tool = doc->AddTool(toLinear ? loader : saver);
        gamut = toLinear ? dynamic_cast<GamutTool<GamutInputs::ToLinear> &>(*tool).gamut.get()
                         : dynamic_cast<GamutTool<GamutInputs::FromLinear> &>(*tool).gamut.get();
    }
    /// ProcessOf for a request carrying the tool's current input values.
    Ref<Image> Process(Image *in, Image *out, OvID clipping = ClippingMode_None, bool convert = true) {
        Request req(tool, nullptr, 0.0, 0, nullptr);
        for (const auto &input : tool->Inputs())
            if (Ref<Parameter> v = input->ValueAt(0.0)) req.SetInputData(input.get(), v.Get());
        return gamut->ProcessOf(&req, in, out, clipping, convert);
    }
};

TEST(GamutInputs, AddsItsInputsShowsWhatTheSpaceNeedsAndPassesTheImageWhenOff) {
    Fixture f(true);
    ASSERT_NE(f.tool->FindInput("GamutSpace"), nullptr);
    EXPECT_EQ(f.gamut->CurveOf(nullptr).space, GamutSpace::NoChange);
    EXPECT_EQ(f.tool->FindInput("GamutAddGamma"), nullptr);
    // The space chosen (none: No Change, the default) and the inputs shown.
    const std::pair<const char *, const char *> cases[] = {
        {nullptr, ""},
        {"Gamma", "GamutGamma GamutRemoveGamma GamutPreDivide"},
        {"CineonLog", "GamutLogBlack GamutLogWhite GamutLogFilmGamma GamutLogSoftClip GamutRemoveGamma GamutPreDivide"},
        {"sRGB", "GamutRemoveGamma GamutPreDivide"},
        {"Linear", ""},
    };
    for (const auto &[chosen, shown] : cases) {
        SCOPED_TRACE(chosen ? chosen : "NoChange");
        if (chosen) ts::SetID(f.tool, "GamutSpace", chosen);
        for (const char *id : {"GamutGamma", "GamutLogBlack", "GamutLogWhite", "GamutLogFilmGamma", "GamutLogSoftClip",
                               "GamutRemoveGamma", "GamutPreDivide"}) {
            Input *in = f.tool->FindInput(id);
            ASSERT_NE(in, nullptr) << id;
            EXPECT_EQ(in->IsVisible(), std::string(shown).find(id) != std::string::npos) << id;
        }
    }
    Fixture saver(false);
    ASSERT_NE(saver.tool->FindInput("GamutAddGamma"), nullptr);
    for (GamutSpace s : {GamutSpace::NoChange, GamutSpace::SRGB, GamutSpace::Rec709, GamutSpace::CineonLog})
        EXPECT_EQ(GamutInputs::SpaceOf(GamutInputs::SpaceID(s)), s);
    // No Change, and sRGB switched off, pass the image through.
    ts::SetID(f.tool, "GamutSpace", "NoChange");
    Ref<Image> img = ts::PatternImage(6, 4);
    const FltPixel before = img->GetFlt(2, 2);
    EXPECT_EQ(f.Process(img.Get(), nullptr).Get(), img.Get());
    ts::SetID(f.tool, "GamutSpace", "sRGB");
    EXPECT_EQ(f.Process(img.Get(), nullptr, ClippingMode_None, false).Get(), img.Get());
    ts::SetNumber(f.tool, "GamutRemoveGamma", 0);
    EXPECT_EQ(f.Process(img.Get(), img.Get()).Get(), img.Get());
    EXPECT_EQ(img->GetFlt(2, 2), before);
}

TEST(GamutInputs, ConvertsFloatAndIntegerImagesWithTheClippingModesInBothDirections) {
    for (int depth : {DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
        SCOPED_TRACE(depth);
        Fixture f(true);
        ts::SetID(f.tool, "GamutSpace", "sRGB");
        Ref<Image> src = NewImageTagList({{ImgWidth, 8}, {ImgHeight, 3}, {ImgDepth, depth}});
        src->AllocScanLineData();
        for (int y = 0; y < 3; ++y)
            for (int x = 0; x < 8; ++x) src->PutFlt(x, y, {x / 7.f, y / 2.f, 0.5f, 0.25f + x / 16.f});
        src->SetCanvasColor(FltPixel{0.5f, 0, 0, 0});
        Ref<Image> out = f.Process(src.Get(), nullptr);
        ASSERT_TRUE(out && out.Get() != src.Get() && out->Depth() == depth);
        const double tol = depth == DepthRGBAInt8 ? 0.5 / 255 + 1e-6 : depth == DepthRGBAInt16 ? 1e-5 : 2e-3;
        for (int y = 0; y < 3; ++y)
            for (int x = 0; x < 8; ++x) {
                const FltPixel a = src->GetFlt(x, y), b = out->GetFlt(x, y);
                ts::ExpectPixelNear(b, {Decode(a.R), Decode(a.G), Decode(a.B), a.A}, tol);
                EXPECT_EQ(b.A, a.A);
            }
        EXPECT_NEAR(out->GetCanvasColor().R, Decode(0.5f), 1e-6);
    }
    Fixture f(false);
    ts::SetID(f.tool, "GamutSpace", "CineonLog");
    ts::SetNumber(f.tool, "GamutLogWhite", 700);
    CineonLogParams log;
    log.white = 700;
    auto code = [&](double v) { return static_cast<float>(LinearToCineon(v, log)); };
    const ImgRectI dw(-2, 0, 6, 4), frame(0, 0, 4, 4); // the data window reaches left of the frame
    const FltPixel canvas{0.25f, 0.25f, 0.25f, 1};
    auto image = [&] {
        Ref<Image> img = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}, {ImgDataWindow, &dw}});
        img->AllocScanLineData();
        img->Fill({1, 0.18f, 0, 1});
        img->SetCanvasColor(canvas);
        return img;
    };
    // Into new images: Frame cuts the window to the frame; only None converts the canvas.
    for (const auto &[mode, window] :
         {std::pair{ClippingMode_Frame, frame}, {ClippingMode_Domain, dw}, {ClippingMode_None, dw}}) {
        SCOPED_TRACE(mode.Text());
        Ref<Image> out = f.Process(image().Get(), nullptr, mode);
        ASSERT_TRUE(out && out->DataWindow() == window);
        ts::ExpectPixelNear(out->GetFlt(window.x0, 1), {code(1), code(0.18), code(0), 1}, 1e-6);
        EXPECT_NEAR(out->GetCanvasColor().R, mode == ClippingMode_None ? code(0.25) : 0.25f, 1e-6);
    }
    // In place for Frame: only the pixels inside the frame change.
    Ref<Image> img = image();
    EXPECT_EQ(f.Process(img.Get(), img.Get(), ClippingMode_Frame).Get(), img.Get());
    for (int x = -2; x < 6; ++x) EXPECT_NEAR(img->GetFlt(x, 2).G, frame.Contains(x, 2) ? code(0.18) : 0.18f, 1e-6) << x;
    // A read-only image is never written: a new one comes back.
    Ref<Image> fresh = image();
    fresh->SetReadOnly();
    Ref<Image> copy = f.Process(fresh.Get(), fresh.Get());
    EXPECT_TRUE(copy && copy.Get() != fresh.Get());
    EXPECT_EQ(fresh->GetFlt(1, 1).G, 0.18f);
    // Pre-divide: colour over alpha goes through the curve, then times alpha.
    ts::SetNumber(f.tool, "GamutPreDivide", 1);
    Ref<Image> half = NewImageTagList({{ImgWidth, 2}, {ImgHeight, 1}});
    half->AllocScanLineData();
    half->Fill({0.09f, 0.09f, 0.09f, 0.5f});
    Ref<Image> pre = f.Process(half.Get(), nullptr);
    EXPECT_NEAR(pre ? pre->GetFlt(0, 0).R : -1, 0.5 * code(0.18), 1e-6);
}

} // namespace
} // namespace Orvane::gamutinputstest
