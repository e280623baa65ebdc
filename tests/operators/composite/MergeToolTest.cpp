// Merge and MultiMerge: the background's transform handed on, foreground
// placement on known images against hand-computed pixel positions, the
// background's pending transform surviving with one resampling per source,
// the reference size and frame format, pre-calculation windows, MultiMerge's
// layer order, enabled switches, a LayerOrder that is no table, Blend's two
// ways, and an over against oiiotool.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <iterator>
#include <string>
#include <vector>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/MergeModes.h"
#include "host/image/NewImage.h"
#include "host/image/TransformMatrix.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/media/FormatTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::mergetooltest {
namespace {

using Orvane::Test::AddImageSource;
using Orvane::Test::ImageSourceTool;
using Orvane::Test::SetNumber;
using Orvane::Test::SetPoint;

class MergeTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

/// A w x h float image whose every pixel tells where it came from: red
/// 0.01 (i + 1), green 0.01 (j + 1), blue `tag`, opaque.
Ref<Image> Numbered(int w, int h, float tag, double xScale = 1.0) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    img->SetScale(xScale, 1.0);
    img->AllocScanLineData();
    for (int j = 0; j < h; ++j)
        for (int i = 0; i < w; ++i) img->PutFlt(i, j, {0.01f * (i + 1), 0.01f * (j + 1), tag, 1.f});
    return img;
}

Ref<Image> Solid(int w, int h, FltPixel c) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    img->Fill(c);
    return img;
}

Ref<Image> Render(Operator *op, bool cache = false) {
    EvalOptions opt;
    opt.useCache = cache;
    Ref<Parameter> p = Evaluate(op->FindMainOutput(), 0.0, opt);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

bool Connect(Operator *to, const char *input, Operator *from) {
    Input *in = to->FindInput(input);
    return in && in->ConnectTo(from->FindMainOutput());
}

/// The foreground pixel (i, j) at every (x, y) that `where` names, the grey
/// background elsewhere.
::testing::AssertionResult Placed(const Image &out, const Image &fg, const FltPixel &bg,
                                  const std::function<bool(int, int, int &, int &)> &where) {
    for (int y = 0; y < out.Height(); ++y)
        for (int x = 0; x < out.Width(); ++x) {
            int i, j;
            const FltPixel want = where(x, y, i, j) ? fg.GetFlt(i, j) : bg;
            const FltPixel got = out.GetFlt(x, y);
            if (!(std::fabs(got.R - want.R) < 1e-6f && std::fabs(got.G - want.G) < 1e-6f &&
                  std::fabs(got.B - want.B) < 1e-6f && std::fabs(got.A - want.A) < 1e-6f))
                return ::testing::AssertionFailure()
                       << "at " << x << "," << y << ": got " << got.R << " " << got.G << " " << got.B << ", want "
                       << want.R << " " << want.G << " " << want.B;
        }
    return ::testing::AssertionSuccess();
}

struct MergeFlow {
    OrvaneDoc doc;
    ImageSourceTool *bg = nullptr, *fg = nullptr;
    Operator *merge = nullptr;
    MergeFlow(Ref<Image> background, Ref<Image> foreground) {
        bg = AddImageSource(doc, "Back", std::move(background));
        fg = AddImageSource(doc, "Fore", std::move(foreground));
        merge = doc.AddTool(OvID("Merge"));
        EXPECT_TRUE(merge && Connect(merge, "Background", bg) && Connect(merge, "Foreground", fg));
    }
};

const FltPixel kGrey{0.2f, 0.2f, 0.2f, 1.f};

TEST_F(MergeTool, BothClassesCarryTheirIdentity) {
    const Registry *merge = ClassRegistry->Find(OvID("Merge"));
    ASSERT_NE(merge, nullptr);
    const auto aliases = merge->Tags().FindAll(RegAlias);
    ASSERT_EQ(aliases.size(), 1u);
    EXPECT_STREQ(aliases[0]->AsText(), "ZMerge");
    EXPECT_EQ(merge->TypeFlags(), RegKindOperator | RegKindTool | RegKindTwoImage);
    EXPECT_STREQ(merge->Tags().GetText(RegPath), "Tools/Composite/Merge");
    EXPECT_STREQ(merge->Tags().GetText(RegAbbreviation), "Mrg");
    EXPECT_STREQ(merge->Tags().GetText(RegHelp), "Layers one image over another, with rotation, scaling and offset");
    EXPECT_EQ(merge->Tags().GetLong(RegSortOrder), 1);
    const Registry *multi = ClassRegistry->Find(OvID("MultiMerge"));
    ASSERT_NE(multi, nullptr);
    EXPECT_EQ(multi->TypeFlags(), RegKindOperator | RegKindTool | RegKindVariableInputs);
    EXPECT_STREQ(multi->Tags().GetText(RegHelp), "Multi-input Merge");
    for (const Registry *row : {merge, multi}) {
        EXPECT_FALSE(row->Tags().GetBool(RegPlanned));
        for (Tag tag : {RegSupportsRoI, RegSupportsDoD, RegSupportsGPUImages}) EXPECT_TRUE(row->Tags().GetBool(tag));
        EXPECT_TRUE(row->IsClassType(OvID("ThreadedOperator")));
    }
    // The inputs in their order, the merge's group inside.
    OrvaneDoc doc;
    Operator *m = doc.AddTool(OvID("Merge"));
    ASSERT_NE(m, nullptr);
    EXPECT_EQ(m->Inputs()[0]->ID(), OvID("Background"));
    EXPECT_EQ(m->Inputs()[1]->ID(), OvID("Foreground"));
    EXPECT_EQ(m->FindMainInput(2), m->FindInput("Foreground"));
    EXPECT_EQ(m->Pages()[0].name, "Merge");
    EXPECT_EQ(m->Pages()[1].name, "Channels");
    for (const char *id : {"Center", "Size", "Angle", "ApplyMode", "Operator", "SubtractiveAdditive", "AlphaGain",
                           "BurnIn", "MergeBlend", "Edges", "FilterMethod", "PerformDepthMerge", "Width", "Height",
                           "UseFrameFormatSettings", "Blend"})
        EXPECT_NE(m->FindInput(id), nullptr) << id;
    EXPECT_FALSE(m->FindInput("Width")->IsExternal());
    EXPECT_TRUE(m->FindInput("Width")->IsPassive());
    // The operator list shows for Normal only.
    SetNumber(m, "ApplyMode", MrgMultiply);
    EXPECT_FALSE(m->FindInput("Operator")->IsVisible());
    SetNumber(m, "ApplyMode", MrgNormal);
    EXPECT_TRUE(m->FindInput("Operator")->IsVisible());
}

TEST_F(MergeTool, WithoutAForegroundTheBackgroundsTransformGoesOnUnchanged) {
    OrvaneDoc doc;
    Operator *merge = doc.AddTool(OvID("Merge"));
    ASSERT_NE(merge, nullptr);
    ASSERT_FALSE(merge->IsPlaceholder()) << "the built class";
    Ref<Image> bgImage = Solid(16, 8, kGrey);
    Ref<TransformMatrix> pending = MakeRef<TransformMatrix>(bgImage.Get());
    const Matrix3 m = Matrix3::Translate(3.5, -2) * Matrix3::Rotate(30);
    pending->SetSourceToOutput(m);
    Request req(merge, merge->FindMainOutput(), 0.0, 0, nullptr);
    for (const auto &in : merge->Inputs()) req.SlotOf(in.get()).data = in->ValueAt(0.0);
    req.SlotOf(merge->FindInput("Background")).data = pending;
    merge->Process(&req);
    auto *out = dynamic_cast<TransformMatrix *>(req.GetOutputData(merge->FindMainOutput()));
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->Source(), bgImage.Get()) << "no copy of the pixels";
    EXPECT_EQ(out->SourceToOutput(), m);
    EXPECT_EQ(out->Width(), 16);
}

TEST_F(MergeTool, PlacesTheForegroundByCentreSizeAngleAndFlips) {
    // A 4 x 2 foreground on a 20 x 10 grey background. At the defaults its
    // centre (2, 1) lands on the background's centre (10, 5): pixel (i, j)
    // at (8 + i, 4 + j).
    Ref<Image> fgImage = Numbered(4, 2, 0.5f);
    MergeFlow f(Solid(20, 10, kGrey), fgImage);
    auto check = [&](const char *what, const std::function<bool(int, int, int &, int &)> &where) {
        Ref<Image> out = Render(f.merge);
        ASSERT_TRUE(out) << what;
        EXPECT_EQ(out->Width(), 20);
        EXPECT_TRUE(Placed(*out, *fgImage, kGrey, where)) << what;
    };
    auto box = [](int x0, int y0) {
        return [x0, y0](int x, int y, int &i, int &j) {
            i = x - x0, j = y - y0;
            return i >= 0 && i < 4 && j >= 0 && j < 2;
        };
    };
    check("defaults", box(8, 4));
    SetPoint(f.merge, "Center", 0.25, 0.7); // centre at (5, 7)
    check("centre", box(3, 6));
    SetPoint(f.merge, "Center", 0.5, 0.5);
    SetNumber(f.merge, "FlipHoriz", 1);
    check("flip horizontal", [](int x, int y, int &i, int &j) {
        i = 3 - (x - 8), j = y - 4;
        return x >= 8 && x < 12 && j >= 0 && j < 2;
    });
    SetNumber(f.merge, "FlipHoriz", 0);
    SetNumber(f.merge, "FlipVert", 1);
    check("flip vertical", [](int x, int y, int &i, int &j) {
        i = x - 8, j = 1 - (y - 4);
        return i >= 0 && i < 4 && y >= 4 && y < 6;
    });
    SetNumber(f.merge, "FlipVert", 0);
    // A quarter turn anticlockwise about the centre: the centre of pixel
    // (i, j), (i - 1.5, j - 0.5) from the middle, goes to (0.5 - j, i - 1.5),
    // so pixel (i, j) lands on (10 - j, 3 + i).
    SetNumber(f.merge, "Angle", 90);
    check("quarter turn", [](int x, int y, int &i, int &j) {
        j = 10 - x, i = y - 3;
        return i >= 0 && i < 4 && j >= 0 && j < 2;
    });
    SetNumber(f.merge, "Angle", 0);
    // Twice the size with the nearest pixel: every pixel becomes 2 x 2, the
    // block still centred on (10, 5): (6 + 2i .. 7 + 2i, 3 + 2j .. 4 + 2j).
    SetNumber(f.merge, "Size", 2);
    SetNumber(f.merge, "FilterMethod", 0);
    check("size 2", [](int x, int y, int &i, int &j) {
        i = (x - 6) / 2, j = (y - 3) / 2;
        return x >= 6 && x < 14 && y >= 3 && y < 7;
    });
    // X Size alone: twice as wide only.
    SetNumber(f.merge, "Size", 1);
    SetNumber(f.merge, "XSize", 2);
    check("x size 2", [](int x, int y, int &i, int &j) {
        i = (x - 6) / 2, j = y - 4;
        return x >= 6 && x < 14 && j >= 0 && j < 2;
    });
}

TEST_F(MergeTool, AForegroundKeepsItsPixelAspect) {
    // Pixels twice as wide as high on a square-pixel background: each
    // foreground pixel covers two background pixels across.
    Ref<Image> fgImage = Numbered(4, 2, 0.5f, 2.0);
    MergeFlow f(Solid(20, 10, kGrey), fgImage);
    SetNumber(f.merge, "FilterMethod", 0);
    Ref<Image> out = Render(f.merge);
    ASSERT_TRUE(out);
    EXPECT_TRUE(Placed(*out, *fgImage, kGrey, [](int x, int y, int &i, int &j) {
        i = (x - 6) / 2, j = y - 4;
        return x >= 6 && x < 14 && j >= 0 && j < 2;
    }));
}

TEST_F(MergeTool, ReferenceSizeScalesTheForegroundToTheBackgroundsFrame) {
    Ref<Image> fgImage = Numbered(4, 2, 0.5f);
    MergeFlow f(Solid(20, 10, kGrey), fgImage);
    SetNumber(f.merge, "FilterMethod", 0);
    SetNumber(f.merge, "Width", 10); // made for a frame half the background's size
    SetNumber(f.merge, "Height", 5);
    Ref<Image> before = Render(f.merge);
    ASSERT_TRUE(before);
    EXPECT_TRUE(Placed(*before, *fgImage, kGrey, [](int x, int y, int &i, int &j) {
        i = x - 8, j = y - 4;
        return i >= 0 && i < 4 && j >= 0 && j < 2;
    })) << "the reference size alone changes nothing";
    SetNumber(f.merge, "UseReferenceSize", 1);
    Ref<Image> out = Render(f.merge);
    ASSERT_TRUE(out);
    EXPECT_TRUE(Placed(*out, *fgImage, kGrey, [](int x, int y, int &i, int &j) {
        i = (x - 6) / 2, j = (y - 3) / 2;
        return x >= 6 && x < 14 && y >= 3 && y < 7;
    }));
}

TEST_F(MergeTool, UseFrameFormatSettingsFollowsTheDocument) {
    OrvaneDoc doc;
    doc.SetPref(PREF_FFWidth, 1280);
    doc.SetPref(PREF_FFHeight, 720);
    Operator *merge = doc.AddTool(OvID("Merge"));
    ASSERT_NE(merge, nullptr);
    Input *w = merge->FindInput("Width"), *h = merge->FindInput("Height");
    ASSERT_TRUE(w && h);
    EXPECT_EQ(dynamic_cast<const Number *>(w->Constant().Get())->value, 1280.0) << "the default is the document's";
    SetNumber(merge, "Width", 640);
    SetNumber(merge, "Height", 480);
    doc.SetPref(PREF_FFWidth, 3840);
    doc.SetPref(PREF_FFHeight, 2160);
    SetNumber(merge, "UseFrameFormatSettings", 1);
    EXPECT_EQ(dynamic_cast<const Number *>(w->Constant().Get())->value, 3840.0);
    EXPECT_EQ(dynamic_cast<const Number *>(h->Constant().Get())->value, 2160.0);
    EXPECT_FALSE(w->IsVisible());
    EXPECT_FALSE(h->IsVisible());
    SetNumber(merge, "UseFrameFormatSettings", 0);
    EXPECT_TRUE(w->IsVisible());
}

TEST_F(MergeTool, TheDomainIsTheUnionOfBothWindows) {
    // The foreground hangs off the background's top right corner.
    MergeFlow f(Solid(20, 10, kGrey), Numbered(4, 2, 0.5f));
    SetPoint(f.merge, "Center", 1.0, 1.0); // centre at (20, 10): pixels (18..21, 9..10)
    EvalOptions pre;
    pre.flags = ReqFlagPreCalc;
    Ref<Parameter> shape = Evaluate(f.merge->FindMainOutput(), 0.0, pre);
    auto *img = dynamic_cast<Image *>(shape.Get());
    ASSERT_NE(img, nullptr);
    EXPECT_TRUE(img->IsNoData());
    EXPECT_EQ(img->DataWindow(), ImgRectI(0, 0, 22, 11));
    Ref<Image> out = Render(f.merge);
    ASSERT_TRUE(out);
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 22, 11));
    EXPECT_EQ(out->GetFlt(21, 10), Numbered(4, 2, 0.5f)->GetFlt(3, 1)); // foreground pixel (i, j) at (18 + i, 9 + j)
}

TEST_F(MergeTool, ThePendingTransformSurvivesAndEachSourceIsResampledOnce) {
    // Background -> Transform (a quarter turn) -> Merge. The merge lays the
    // foreground into the background's source and keeps the quarter turn
    // pending: the foreground is resampled once (into that source), the
    // background once (at the end).
    OrvaneDoc doc;
    Ref<Image> bgImage = Numbered(12, 12, 0.9f), fgImage = Numbered(4, 2, 0.5f);
    ImageSourceTool *bg = AddImageSource(doc, "Back", bgImage);
    ImageSourceTool *fg = AddImageSource(doc, "Fore", fgImage);
    Operator *xf = doc.AddTool(OvID("Transform"));
    Operator *merge = doc.AddTool(OvID("Merge"));
    ASSERT_TRUE(xf && merge);
    ASSERT_TRUE(Connect(xf, "Input", bg) && Connect(merge, "Background", xf) && Connect(merge, "Foreground", fg));
    SetNumber(xf, "Angle", 90);
    Ref<Image> turned = Render(xf);
    ASSERT_TRUE(turned);
    const long before = TransformMatrix::ResampleCount();
    Ref<Image> out = Render(merge);
    ASSERT_TRUE(out);
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 2);
    // What the merge hands on is the turn, still pending, over new pixels.
    Request req(merge, merge->FindMainOutput(), 0.0, 0, nullptr);
    for (const auto &in : merge->Inputs()) req.SlotOf(in.get()).data = in->ValueAt(0.0);
    Ref<Image> bgCopy = bgImage;
    Ref<TransformMatrix> pending = MakeRef<TransformMatrix>(bgCopy.Get());
    pending->SetSourceToOutput(NormalisedToPixelMatrix(TransformTagsMatrix({{XfAngle, 90.0}}, 12, 12, 1, 1), 12, 12));
    req.SlotOf(merge->FindInput("Background")).data = pending;
    req.SlotOf(merge->FindInput("Foreground")).data = fgImage;
    merge->Process(&req);
    auto *tm = dynamic_cast<TransformMatrix *>(req.GetOutputData(merge->FindMainOutput()));
    ASSERT_NE(tm, nullptr);
    EXPECT_EQ(tm->SourceToOutput(), pending->SourceToOutput());
    EXPECT_NE(tm->Source(), bgImage.Get());
    // The pixels: the foreground over the turned background, in the output
    // frame, as if the turn had been made first.
    for (int y = 0; y < 12; ++y)
        for (int x = 0; x < 12; ++x) {
            const bool under = x >= 4 && x < 8 && y >= 5 && y < 7;
            EXPECT_EQ(out->GetFlt(x, y), under ? fgImage->GetFlt(x - 4, y - 5) : turned->GetFlt(x, y)) << x << "," << y;
        }
}

TEST_F(MergeTool, AChainOfWholePixelMergesResamplesOnceAtMost) {
    // Two merges in a row with foregrounds on whole pixels: nothing is
    // resampled at all, and the second merge keeps the first's layer.
    OrvaneDoc doc;
    Ref<Image> a = Numbered(4, 2, 0.3f), b = Numbered(2, 2, 0.7f);
    ImageSourceTool *bg = AddImageSource(doc, "Back", Solid(20, 10, kGrey));
    ImageSourceTool *fa = AddImageSource(doc, "A", a);
    ImageSourceTool *fb = AddImageSource(doc, "B", b);
    Operator *m1 = doc.AddTool(OvID("Merge"));
    Operator *m2 = doc.AddTool(OvID("Merge"));
    ASSERT_TRUE(Connect(m1, "Background", bg) && Connect(m1, "Foreground", fa));
    ASSERT_TRUE(Connect(m2, "Background", m1) && Connect(m2, "Foreground", fb));
    SetPoint(m2, "Center", 0.25, 0.5); // b's centre at (5, 5): pixels (4..5, 4..5)
    const long before = TransformMatrix::ResampleCount();
    Ref<Image> out = Render(m2);
    ASSERT_TRUE(out);
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 0);
    for (int y = 0; y < 10; ++y)
        for (int x = 0; x < 20; ++x) {
            FltPixel want = kGrey;
            if (x >= 8 && x < 12 && y >= 4 && y < 6) want = a->GetFlt(x - 8, y - 4);
            if (x >= 4 && x < 6 && y >= 4 && y < 6) want = b->GetFlt(x - 4, y - 4);
            ASSERT_EQ(out->GetFlt(x, y), want) << x << "," << y;
        }
}

TEST_F(MergeTool, ApplyModeAndControlsReachThePixels) {
    // Half-transparent foreground, Screen with blend: the pixel through the
    // formulas of the merge itself.
    Ref<Image> fgImage = Solid(4, 2, {0.3f, 0.1f, 0.2f, 0.5f});
    MergeFlow f(Solid(20, 10, {0.4f, 0.5f, 0.6f, 1.f}), fgImage);
    SetNumber(f.merge, "ApplyMode", MrgScreen);
    SetNumber(f.merge, "MergeBlend", 0.5);
    SetNumber(f.merge, "MergeGreen", 0);
    Ref<Image> out = Render(f.merge);
    ASSERT_TRUE(out);
    // Screen: cs + cb - cs cb where both have alpha (here as 0.5, ab 1:
    // cs (1 - 1) + cb (1 - 0.5) + 0.5 cb + cs - cs cb); then half way back
    // to the background; green stays the background's.
    const double r = 0.3 + 0.4 - 0.3 * 0.4, b = 0.2 + 0.6 - 0.2 * 0.6;
    const FltPixel got = out->GetFlt(9, 5);
    EXPECT_NEAR(got.R, 0.4 + 0.5 * (r - 0.4), 1e-6);
    EXPECT_EQ(got.G, 0.5f);
    EXPECT_NEAR(got.B, 0.6 + 0.5 * (b - 0.6), 1e-6);
    EXPECT_NEAR(got.A, 1.0, 1e-6);
    EXPECT_EQ(out->GetFlt(2, 2), (FltPixel{0.4f, 0.5f, 0.6f, 1.f})) << "beyond the foreground";
}

TEST_F(MergeTool, DepthMergeFollowsTheForegroundThroughItsPlacement) {
    // A quarter-turned foreground at depth 1 over a background at depth 2
    // on the left half and 0.5 on the right: the foreground shows on the
    // left only, and the result's Z is the nearer one.
    Ref<Image> fgImage = Numbered(4, 2, 0.5f), bgImage = Solid(20, 10, kGrey);
    fgImage->AddAuxChannel(AuxChannelKind::Z);
    bgImage->AddAuxChannel(AuxChannelKind::Z);
    for (int y = 0; y < 2; ++y)
        for (int x = 0; x < 4; ++x) fgImage->AuxRow(AuxChannelKind::Z, y)[x] = 1.f;
    for (int y = 0; y < 10; ++y)
        for (int x = 0; x < 20; ++x) bgImage->AuxRow(AuxChannelKind::Z, y)[x] = x < 10 ? 2.f : 0.5f;
    MergeFlow f(bgImage, fgImage);
    SetNumber(f.merge, "Angle", 90); // pixel (i, j) on (10 - j, 3 + i): columns 9 and 10
    SetNumber(f.merge, "PerformDepthMerge", 1);
    Ref<Image> out = Render(f.merge);
    ASSERT_TRUE(out);
    ASSERT_TRUE(out->HasAuxChannel(AuxChannelKind::Z));
    for (int y = 3; y < 7; ++y) {
        EXPECT_EQ(out->GetFlt(9, y), fgImage->GetFlt(y - 3, 1)) << y; // in front of depth 2
        EXPECT_EQ(out->GetFlt(10, y), kGrey) << y;                    // behind depth 0.5
        EXPECT_EQ(out->AuxRow(AuxChannelKind::Z, y)[9], 1.f);
        EXPECT_EQ(out->AuxRow(AuxChannelKind::Z, y)[10], 0.5f);
    }
    EXPECT_EQ(out->AuxRow(AuxChannelKind::Z, 0)[3], 2.f) << "the background's Z beyond the foreground";
    SetNumber(f.merge, "PerformDepthMerge", 0);
    out = Render(f.merge);
    EXPECT_EQ(out->GetFlt(10, 4), fgImage->GetFlt(1, 0)) << "without the switch the foreground lies on top";
}

TEST_F(MergeTool, OnTheDeviceTheToolGivesTheRowsBits) {
    ORVANE_NEED_OPENCL(ctx);
    Ref<Image> fgImage = Orvane::Test::PatternImage(24, 14, DepthRGBAFlt32, 21);
    MergeFlow f(Orvane::Test::PatternImage(40, 22, DepthRGBAFlt32, 22), fgImage);
    SetPoint(f.merge, "Center", 0.3, 0.6);
    for (int mode : {MrgNormal, MrgScreen, MrgMultiply}) {
        SetNumber(f.merge, "ApplyMode", mode);
        Ref<Image> rows = Render(f.merge);
        RenderTask task;
        task.SetDevice(ctx);
        EvalOptions opt;
        opt.useCache = false;
        opt.task = &task;
        const int launches = ctx->LaunchCount();
        Ref<Parameter> p = Evaluate(f.merge->FindMainOutput(), 0.0, opt);
        auto *dev = dynamic_cast<Image *>(p.Get());
        ASSERT_TRUE(rows && dev) << mode;
        EXPECT_EQ(ctx->LaunchCount(), launches + 1) << mode;
        ASSERT_EQ(dev->DataWindow(), rows->DataWindow());
        const ImgRectI dw = rows->DataWindow();
        EXPECT_EQ(std::memcmp(dev->ScanLine(dw.y0), rows->ScanLine(dw.y0), rows->RowBytes() * dw.Height()), 0) << mode;
    }
}

// ---- MultiMerge ----

/// The layer numbers of a MultiMerge's LayerOrder value.
std::vector<int> LayerOrderOf(const Operator *mm) {
    std::vector<int> order;
    const auto *v = dynamic_cast<const ScriptValue *>(mm->FindInput("LayerOrder")->Constant().Get());
    if (v && v->value.IsTable())
        for (const auto &[key, n] : v->value.Entries()) order.push_back(static_cast<int>(n.AsNumber()));
    return order;
}

struct MultiFlow {
    OrvaneDoc doc;
    ImageSourceTool *bg, *l1, *l2;
    Operator *mm;
    Ref<Image> bgImage = Solid(20, 10, kGrey), a = Numbered(4, 2, 0.3f), b = Numbered(4, 2, 0.7f);
    MultiFlow() {
        bg = AddImageSource(doc, "Back", bgImage);
        l1 = AddImageSource(doc, "A", a);
        l2 = AddImageSource(doc, "B", b);
        mm = doc.AddTool(OvID("MultiMerge"));
        EXPECT_TRUE(mm && !mm->IsPlaceholder());
        EXPECT_TRUE(Connect(mm, "Background", bg));
        EXPECT_TRUE(Connect(mm, "Layer1.Foreground", l1));
        EXPECT_NE(mm->FindInput("Layer2.Foreground"), nullptr) << "one empty layer beyond the connected ones";
        EXPECT_TRUE(Connect(mm, "Layer2.Foreground", l2));
        // Layer 2 sits two pixels right of layer 1: they overlap on x 10, 11.
        SetPoint(mm, "Layer2.Center", 0.6, 0.5);
    }
    void Order(std::vector<double> order) {
        ScriptVal t = ScriptVal::Table();
        for (double n : order) t.Append(n);
        ASSERT_TRUE(mm->FindInput("LayerOrder")->SetValue(MakeRef<ScriptValue>(t)));
    }
};

TEST_F(MergeTool, MultiMergeLaysTheLayersInTheListsOrder) {
    MultiFlow f;
    EXPECT_EQ(LayerOrderOf(f.mm), (std::vector<int>{1, 2})) << "connecting adds to the order";
    EXPECT_EQ(dynamic_cast<const Text *>(f.mm->FindInput("LayerName1")->Constant().Get())->value, "A Layer");
    EXPECT_NE(f.mm->FindInput("Layer3.Foreground"), nullptr);
    auto expect = [&](bool bOnTop) {
        Ref<Image> out = Render(f.mm);
        ASSERT_TRUE(out);
        for (int y = 0; y < 10; ++y)
            for (int x = 0; x < 20; ++x) {
                const bool inA = x >= 8 && x < 12 && y >= 4 && y < 6, inB = x >= 10 && x < 14 && y >= 4 && y < 6;
                FltPixel want = kGrey;
                if (inA && (!inB || !bOnTop)) want = f.a->GetFlt(x - 8, y - 4);
                if (inB && (!inA || bOnTop)) want = f.b->GetFlt(x - 10, y - 4);
                ASSERT_EQ(out->GetFlt(x, y), want) << x << "," << y << (bOnTop ? " b on top" : " a on top");
            }
    };
    expect(true);
    f.Order({2, 1, 0, -3});
    expect(false);
}

TEST_F(MergeTool, MultiMergeSkipsDisabledLayersWithoutRenderingThem) {
    MultiFlow f;
    SetNumber(f.mm, "LayerEnabled2", 0.49); // rounds to 0
    const int rendered = f.l2->processCount;
    Ref<Image> out = Render(f.mm);
    ASSERT_TRUE(out);
    EXPECT_EQ(f.l2->processCount, rendered) << "a disabled layer's source is not rendered";
    EXPECT_EQ(out->GetFlt(12, 4), kGrey);
    EXPECT_EQ(out->GetFlt(9, 4), f.a->GetFlt(1, 0));
    EXPECT_EQ(LayerOrderOf(f.mm), (std::vector<int>{1, 2})) << "it stays in the list";
    SetNumber(f.mm, "LayerEnabled2", 0.5); // rounds to 1
    out = Render(f.mm);
    EXPECT_EQ(out->GetFlt(12, 4), f.b->GetFlt(2, 0));
}

TEST_F(MergeTool, MultiMergeWithoutATableOrderHandsOnTheBackground) {
    MultiFlow f;
    ASSERT_TRUE(f.mm->FindInput("LayerOrder")->SetValue(MakeRef<ScriptValue>(ScriptVal(2.0))));
    Ref<Image> out = Render(f.mm);
    ASSERT_TRUE(out);
    EXPECT_EQ(out.Get(), f.bgImage.Get()) << "the Background itself, not a copy";
    f.Order({});
    out = Render(f.mm);
    EXPECT_EQ(out.Get(), f.bgImage.Get());
}

TEST_F(MergeTool, MultiMergeBlendMixesTheStackBackOverTheBackground) {
    MultiFlow f;
    Ref<Image> full = Render(f.mm);
    ASSERT_TRUE(full);
    SetNumber(f.mm, "Blend", 0.25);
    const long before = TransformMatrix::ResampleCount();
    Ref<Image> quarter = Render(f.mm);
    ASSERT_TRUE(quarter);
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 0) << "mixed in the source, nothing resampled";
    for (int y = 0; y < 10; ++y)
        for (int x = 0; x < 20; ++x) {
            const FltPixel s = full->GetFlt(x, y);
            const FltPixel got = quarter->GetFlt(x, y);
            ASSERT_NEAR(got.R, kGrey.R + 0.25 * (s.R - kGrey.R), 1e-6) << x << "," << y;
            ASSERT_NEAR(got.G, kGrey.G + 0.25 * (s.G - kGrey.G), 1e-6);
            ASSERT_NEAR(got.B, kGrey.B + 0.25 * (s.B - kGrey.B), 1e-6);
        }
    // Blend 0 is the Background; switching a channel off keeps its values.
    SetNumber(f.mm, "Blend", 0.0);
    Ref<Image> none = Render(f.mm);
    EXPECT_EQ(none->GetFlt(9, 4), kGrey);
    SetNumber(f.mm, "Blend", 0.5);
    SetNumber(f.mm, "ProcessRed", 0);
    Ref<Image> noRed = Render(f.mm);
    EXPECT_EQ(noRed->GetFlt(9, 4).R, kGrey.R);
    EXPECT_NEAR(noRed->GetFlt(9, 4).G, kGrey.G + 0.5 * (full->GetFlt(9, 4).G - kGrey.G), 1e-6);
}

TEST_F(MergeTool, MultiMergeLayersComeBackWithTheDocument) {
    // Values of layer inputs in a document, whatever order they come in.
    const char *text = R"(Orvane.Document {
	Tools = {
		Back = Background { Inputs = { Width = 20, Height = 10 } },
		MM = MultiMerge {
			Inputs = {
				["Layer3.Size"] = 2,
				LayerName3 = "Third",
				LayerOrder = { 3 },
				Background = Back.Output,
			},
		},
	},
})";
    OrvaneDoc doc;
    DocumentLoadResult r = LoadDocument(text, doc);
    ASSERT_TRUE(r.ok) << r.error;
    Operator *mm = doc.FindTool("MM");
    ASSERT_NE(mm, nullptr);
    ASSERT_NE(mm->FindInput("Layer3.Size"), nullptr);
    EXPECT_EQ(dynamic_cast<const Number *>(mm->FindInput("Layer3.Size")->Constant().Get())->value, 2.0);
    EXPECT_EQ(dynamic_cast<const Text *>(mm->FindInput("LayerName3")->Constant().Get())->value, "Third");
    EXPECT_EQ(mm->KeptInputs().Size(), 0u);
    EXPECT_EQ(LayerOrderOf(mm), (std::vector<int>{3}));
}

// ---- against oiiotool ----

bool HaveProgram(const char *name) {
    const std::string cmd = std::string("command -v ") + name + " > /dev/null 2>&1";
    return std::system(cmd.c_str()) == 0;
}

TEST_F(MergeTool, OverAgreesWithOiiotool) {
    if (!HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    // Both full frame, the foreground with alphas across 0..1 and colours
    // above 1, so that the hold-out and the add both show.
    Ref<Image> fgImage = Orvane::Test::PatternImage(33, 17, DepthRGBAFlt32, 11);
    Ref<Image> bgImage = Orvane::Test::PatternImage(33, 17, DepthRGBAFlt32, 12);
    for (int y = 0; y < 17; ++y)
        for (int x = 0; x < 33; ++x) {
            FltPixel p = fgImage->GetFlt(x, y);
            p.A = std::clamp(p.A, 0.f, 1.f); // premultiplied data in the usual range of alpha
            fgImage->PutFlt(x, y, p);
        }
    const std::string dir = ::testing::TempDir() + "merge_oiio_" + std::to_string(::getpid());
    std::system(("mkdir -p " + dir).c_str());
    auto save = [&](Image *img, const std::string &path) {
        const FmtTest::Bytes bytes = FmtTest::Save("OpenEXRFormat", img);
        std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char *>(bytes.data()), bytes.size());
    };
    save(fgImage.Get(), dir + "/fg.exr");
    save(bgImage.Get(), dir + "/bg.exr");
    const std::string cmd =
        "oiiotool " + dir + "/fg.exr " + dir + "/bg.exr --over -d float -o " + dir + "/over.exr > /dev/null 2>&1";
    ASSERT_EQ(std::system(cmd.c_str()), 0) << cmd;
    std::ifstream file(dir + "/over.exr", std::ios::binary);
    const FmtTest::Bytes bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    FmtTest::LoadResult theirs = FmtTest::Load("OpenEXRFormat", bytes);
    ASSERT_TRUE(theirs.image) << theirs.error;

    MergeFlow f(bgImage, fgImage);
    Ref<Image> ours = Render(f.merge);
    ASSERT_TRUE(ours);
    // Both compute A + B (1 - alpha_A) in float; the only room for a
    // difference is the order of the two roundings (or a fused multiply-add
    // on their side): one rounding step of values up to 2, well below 1e-6.
    for (int y = 0; y < 17; ++y)
        for (int x = 0; x < 33; ++x) {
            const FltPixel a = ours->GetFlt(x, y), b = theirs.image->GetFlt(x, y);
            ASSERT_NEAR(a.R, b.R, 1e-6) << x << "," << y;
            ASSERT_NEAR(a.G, b.G, 1e-6) << x << "," << y;
            ASSERT_NEAR(a.B, b.B, 1e-6) << x << "," << y;
            ASSERT_NEAR(a.A, b.A, 1e-6) << x << "," << y;
        }
    std::system(("rm -rf " + dir).c_str());
}

} // namespace
} // namespace Orvane::mergetooltest
