// GamutInputs on a small tool: the inputs it adds and their visibility, and
// ProcessOf on float and integer images, in place and into new images, with
// the clipping modes; No Change hands the very same image back.
#include "host/flow/GamutInputs.h"

#include <gtest/gtest.h>

#include <cmath>
#include <memory>

#include "host/core/Registry.h"
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
class GamutTool : public Operator {
public:
    GamutTool(const Registry *reg, const ScriptVal &args, const TagList &tags, GamutInputs::Direction dir)
        : Operator(reg, args, tags) {
        AddControlPageTagList("Controls", {});
        AddInputTagList("Depth", "Depth", {{LinkDataType, CLSID_DataType_Number}});
        gamut = std::make_unique<GamutInputs>(this, dir);
        AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override {
        gamut->NotifyChanged(in, param, time);
        Operator::NotifyChanged(in, param, time, tags);
    }
    std::unique_ptr<GamutInputs> gamut;
};

Object *MakeLoaderLike(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new GamutTool(reg, args, tags, GamutInputs::ToLinear);
}
Object *MakeSaverLike(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new GamutTool(reg, args, tags, GamutInputs::FromLinear);
}

OvID Register(const char *id, ClassFactory make) {
    TagList tags{{RegConstructor, make},
                 {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)},
                 {RegNoBlendControls, 1},
                 {RegNoEffectMask, 1}};
    Registry::_Init(&ClassRegistry, OvID(id), tags);
    return OvID(id);
}
OvID LoaderClass() {
    static const OvID id = Register("GamutTestLoader", &MakeLoaderLike);
    return id;
}
OvID SaverClass() {
    static const OvID id = Register("GamutTestSaver", &MakeSaverLike);
    return id;
}

struct Fixture {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    GamutTool *tool;
    explicit Fixture(bool toLinear) {
        tool = dynamic_cast<GamutTool *>(
            doc->AddTool(toLinear ? LoaderClass() : SaverClass(), toLinear ? "Loader1" : "Saver1"));
    }
    /// A request carrying the tool's current input values.
    std::unique_ptr<Request> Req() {
        auto req = std::make_unique<Request>(tool, nullptr, 0.0, 0, nullptr);
        for (const auto &in : tool->Inputs())
            if (Ref<Parameter> v = in->ValueAt(0.0)) req->SetInputData(in.get(), v.Get());
        return req;
    }
};

TEST(GamutInputs, AddsItsInputsAndShowsWhatTheSpaceNeeds) {
    Fixture f(true);
    ASSERT_NE(f.tool, nullptr);
    Input *space = f.tool->FindInput("GamutSpace");
    ASSERT_NE(space, nullptr);
    EXPECT_STREQ(space->Label(), "Source Space");
    EXPECT_EQ(space->Page(), 0); // the tool's current page
    EXPECT_EQ(f.tool->gamut->CurveOf(nullptr).space, GamutSpace::NoChange);
    for (const char *id : {"GamutGamma", "GamutLogBlack", "GamutLogWhite", "GamutLogFilmGamma", "GamutLogSoftClip",
                           "GamutRemoveGamma", "GamutPreDivide"})
        ASSERT_NE(f.tool->FindInput(id), nullptr) << id;
    EXPECT_EQ(f.tool->FindInput("GamutAddGamma"), nullptr);
    auto visible = [&](const char *id) { return f.tool->FindInput(id)->IsVisible(); };
    EXPECT_FALSE(visible("GamutGamma"));
    EXPECT_FALSE(visible("GamutLogBlack"));
    EXPECT_FALSE(visible("GamutRemoveGamma"));

    ts::SetID(f.tool, "GamutSpace", "Gamma");
    EXPECT_TRUE(visible("GamutGamma"));
    EXPECT_FALSE(visible("GamutLogWhite"));
    EXPECT_TRUE(visible("GamutRemoveGamma"));
    ts::SetID(f.tool, "GamutSpace", "CineonLog");
    EXPECT_FALSE(visible("GamutGamma"));
    for (const char *id : {"GamutLogBlack", "GamutLogWhite", "GamutLogFilmGamma", "GamutLogSoftClip"})
        EXPECT_TRUE(visible(id)) << id;
    ts::SetID(f.tool, "GamutSpace", "Linear");
    EXPECT_FALSE(visible("GamutLogBlack"));
    EXPECT_FALSE(visible("GamutRemoveGamma"));

    Fixture saver(false);
    ASSERT_NE(saver.tool->FindInput("GamutAddGamma"), nullptr);
    EXPECT_STREQ(saver.tool->FindInput("GamutSpace")->Label(), "Output Space");
    for (GamutSpace s : {GamutSpace::NoChange, GamutSpace::SRGB, GamutSpace::Rec709, GamutSpace::CineonLog})
        EXPECT_EQ(GamutInputs::SpaceOf(GamutInputs::SpaceID(s)), s);
}

TEST(GamutInputs, NoChangeAndSwitchedOffPassTheImageThrough) {
    Fixture f(true);
    Ref<Image> img = ts::PatternImage(6, 4);
    const FltPixel before = img->GetFlt(2, 2);
    auto req = f.Req();
    EXPECT_EQ(f.tool->gamut->ProcessOf(req.get(), img.Get(), nullptr, ClippingMode_None, true).Get(), img.Get());
    ts::SetID(f.tool, "GamutSpace", "sRGB");
    req = f.Req();
    EXPECT_EQ(f.tool->gamut->ProcessOf(req.get(), img.Get(), nullptr, ClippingMode_None, false).Get(), img.Get());
    ts::SetNumber(f.tool, "GamutRemoveGamma", 0);
    req = f.Req();
    EXPECT_EQ(f.tool->gamut->ProcessOf(req.get(), img.Get(), img.Get(), ClippingMode_None, true).Get(), img.Get());
    EXPECT_EQ(img->GetFlt(2, 2), before);
}

TEST(GamutInputs, ConvertsFloatAndIntegerImages) {
    for (int depth : {DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
        SCOPED_TRACE(depth);
        Fixture f(true);
        ts::SetID(f.tool, "GamutSpace", "sRGB");
        Ref<Image> src = NewImageTagList({{ImgWidth, 8}, {ImgHeight, 3}, {ImgDepth, depth}});
        src->AllocScanLineData();
        for (int y = 0; y < 3; ++y)
            for (int x = 0; x < 8; ++x) src->PutFlt(x, y, {x / 7.f, y / 2.f, 0.5f, 0.25f + x / 16.f});
        const FltPixel canvas{0.5f, 0, 0, 0};
        src->SetCanvasColor(canvas);
        auto req = f.Req();
        Ref<Image> out = f.tool->gamut->ProcessOf(req.get(), src.Get(), nullptr, ClippingMode_None, true);
        ASSERT_TRUE(out);
        ASSERT_NE(out.Get(), src.Get());
        EXPECT_EQ(out->Depth(), depth);
        const double tol = depth == DepthRGBAInt8 ? 0.5 / 255 + 1e-6 : depth == DepthRGBAInt16 ? 1e-5 : 2e-3;
        auto decode = [](double v) { return v <= 0.04045 ? v / 12.92 : std::pow((v + 0.055) / 1.055, 2.4); };
        for (int y = 0; y < 3; ++y)
            for (int x = 0; x < 8; ++x) {
                const FltPixel a = src->GetFlt(x, y), b = out->GetFlt(x, y);
                EXPECT_NEAR(b.R, decode(a.R), tol);
                EXPECT_NEAR(b.G, decode(a.G), tol);
                EXPECT_NEAR(b.B, decode(a.B), tol);
                EXPECT_EQ(b.A, a.A);
            }
        EXPECT_NEAR(out->GetCanvasColor().R, decode(0.5), 1e-6);
    }
}

TEST(GamutInputs, InPlaceFrameClippingAndTheSaverDirection) {
    Fixture f(false);
    ts::SetID(f.tool, "GamutSpace", "CineonLog");
    ts::SetNumber(f.tool, "GamutLogWhite", 700);
    const ImgRectI dw(-2, 0, 6, 4); // reaches left of a 4 x 4 frame
    Ref<Image> img = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}, {ImgDataWindow, &dw}});
    img->AllocScanLineData();
    img->Fill({1, 0.18f, 0, 1});
    const FltPixel canvas{0.25f, 0.25f, 0.25f, 1};
    img->SetCanvasColor(canvas);
    CineonLogParams log;
    log.white = 700;
    const float code18 = static_cast<float>(LinearToCineon(0.18, log));

    // A new image for Frame: cut to the frame, canvas kept.
    auto req = f.Req();
    Ref<Image> framed = f.tool->gamut->ProcessOf(req.get(), img.Get(), nullptr, ClippingMode_Frame, true);
    ASSERT_TRUE(framed);
    EXPECT_EQ(framed->DataWindow(), ImgRectI(0, 0, 4, 4));
    EXPECT_EQ(framed->GetCanvasColor(), canvas);
    EXPECT_NEAR(framed->GetFlt(1, 1).R, 700.0 / 1023, 1e-6);
    EXPECT_NEAR(framed->GetFlt(1, 1).G, code18, 1e-6);

    // In place for Frame: only the pixels inside the frame change.
    Ref<Image> same = f.tool->gamut->ProcessOf(req.get(), img.Get(), img.Get(), ClippingMode_Frame, true);
    EXPECT_EQ(same.Get(), img.Get());
    EXPECT_EQ(img->GetFlt(-1, 2).G, 0.18f);
    EXPECT_EQ(img->GetFlt(5, 2).G, 0.18f);
    EXPECT_NEAR(img->GetFlt(0, 2).G, code18, 1e-6);
    EXPECT_NEAR(img->GetFlt(3, 2).G, code18, 1e-6);

    // Domain keeps the window; None converts the canvas as well.
    Ref<Image> fresh = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}, {ImgDataWindow, &dw}});
    fresh->AllocScanLineData();
    fresh->Fill({1, 0.18f, 0, 1});
    fresh->SetCanvasColor(canvas);
    Ref<Image> domain = f.tool->gamut->ProcessOf(req.get(), fresh.Get(), nullptr, ClippingMode_Domain, true);
    Ref<Image> none = f.tool->gamut->ProcessOf(req.get(), fresh.Get(), nullptr, ClippingMode_None, true);
    ASSERT_TRUE(domain && none);
    EXPECT_EQ(domain->DataWindow(), dw);
    EXPECT_NEAR(domain->GetFlt(-2, 0).G, code18, 1e-6);
    EXPECT_EQ(domain->GetCanvasColor(), canvas);
    EXPECT_NEAR(none->GetCanvasColor().R, LinearToCineon(0.25, log), 1e-6);

    // A read-only image is never written: a new one comes back.
    fresh->SetReadOnly();
    Ref<Image> copy = f.tool->gamut->ProcessOf(req.get(), fresh.Get(), fresh.Get(), ClippingMode_None, true);
    ASSERT_TRUE(copy);
    EXPECT_NE(copy.Get(), fresh.Get());
    EXPECT_EQ(fresh->GetFlt(1, 1).G, 0.18f);

    // Pre-divide: colour over alpha goes through the curve, then times alpha.
    ts::SetNumber(f.tool, "GamutPreDivide", 1);
    Ref<Image> half = NewImageTagList({{ImgWidth, 2}, {ImgHeight, 1}});
    half->AllocScanLineData();
    half->Fill({0.09f, 0.09f, 0.09f, 0.5f});
    req = f.Req();
    Ref<Image> pre = f.tool->gamut->ProcessOf(req.get(), half.Get(), nullptr, ClippingMode_None, true);
    ASSERT_TRUE(pre);
    EXPECT_NEAR(pre->GetFlt(0, 0).R, 0.5 * LinearToCineon(0.18, log), 1e-6);
}

} // namespace
} // namespace Orvane::gamutinputstest
