// Merge and MultiMerge: placement against hand-computed pixel positions, pending transforms resampled once per
// source, windows, layer order and switches, blends, and an over against oiiotool.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

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
using Orvane::Test::SetNumbers;
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
    Ref<Image> img = Numbered(w, h, 0.f);
    img->Fill(c);
    return img;
}

Ref<Image> Render(Operator *op, RenderTask *task = nullptr, uint32_t flags = 0) {
    EvalOptions opt;
    opt.useCache = false;
    opt.task = task;
    opt.flags = flags;
    return Ref<Image>(dynamic_cast<Image *>(Evaluate(op->FindMainOutput(), 0.0, opt).Get()));
}

bool Connect(Operator *to, const char *input, Operator *from) {
    Input *in = to->FindInput(input);
    return in && in->ConnectTo(from->FindMainOutput());
}

/// The merge's own Process with `background` (and `foreground`) given directly: what it hands on.
Ref<Parameter> ProcessWith(Operator *merge, Ref<Parameter> background, Ref<Parameter> foreground = nullptr) {
    Request req(merge, merge->FindMainOutput(), 0.0, 0, nullptr);
    for (const auto &in : merge->Inputs()) req.SlotOf(in.get()).data = in->ValueAt(0.0);
    req.SlotOf(merge->FindInput("Background")).data = background;
    if (foreground) req.SlotOf(merge->FindInput("Foreground")).data = foreground;
    merge->Process(&req);
    return Ref<Parameter>(req.GetOutputData(merge->FindMainOutput()));
}

const FltPixel kGrey{0.2f, 0.2f, 0.2f, 1.f};

/// Every pixel of `out` is `want(x, y)`; the first that is not is named.
::testing::AssertionResult Pixels(const Image &out, const std::function<FltPixel(int, int)> &want, float tol = 0) {
    for (int y = 0; y < out.Height(); ++y)
        for (int x = 0; x < out.Width(); ++x) {
            const FltPixel got = out.GetFlt(x, y), w = want(x, y);
            if (std::fabs(got.R - w.R) > tol || std::fabs(got.G - w.G) > tol || std::fabs(got.B - w.B) > tol ||
                std::fabs(got.A - w.A) > tol)
                return ::testing::AssertionFailure() << "at " << x << "," << y << ": got " << got.R << " " << got.G
                                                     << " " << got.B << ", want " << w.R << " " << w.G << " " << w.B;
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

TEST_F(MergeTool, WithoutAForegroundTheBackgroundsTransformGoesOnUnchanged) {
    OrvaneDoc doc;
    Operator *merge = doc.AddTool(OvID("Merge"));
    ASSERT_TRUE(merge && !merge->IsPlaceholder());
    Ref<Image> bgImage = Solid(16, 8, kGrey);
    Ref<TransformMatrix> pending = MakeRef<TransformMatrix>(bgImage.Get());
    const Matrix3 m = Matrix3::Translate(3.5, -2) * Matrix3::Rotate(30);
    pending->SetSourceToOutput(m);
    auto *out = dynamic_cast<TransformMatrix *>(ProcessWith(merge, pending).Get());
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->Source(), bgImage.Get()) << "no copy of the pixels";
    EXPECT_EQ(out->SourceToOutput(), m);
    EXPECT_EQ(out->Width(), 16);
}

TEST_F(MergeTool, PlacesTheForegroundByItsControlsAndItsPixelAspectInTheUnionOfBothWindows) {
    // A 4 x 2 foreground on a 20 x 10 grey background. At the defaults its centre (2, 1) lands on the background's
    // centre (10, 5): pixel (i, j) at (8 + i, 4 + j). Twice the size with the nearest pixel: every pixel becomes 2 x 2,
    // the block still centred: (6 + 2i, 3 + 2j).
    struct Case {
        std::vector<std::pair<const char *, double>> controls;
        double cx, cy, fgAspect;
        int x0, y0, sx, sy; ///< pixel (i, j) covers (x0 + sx i, y0 + sy j), sx x sy pixels
        char how;           ///< 'x', 'y': flipped that way; 't': turned
    };
    const Case cases[] = {
        {{}, 0.5, 0.5, 1, 8, 4, 1, 1, ' '},
        {{}, 0.25, 0.7, 1, 3, 6, 1, 1, ' '}, // centred on (5, 7)
        {{{"FlipHoriz", 1}}, 0.5, 0.5, 1, 8, 4, 1, 1, 'x'},
        {{{"FlipVert", 1}}, 0.5, 0.5, 1, 8, 4, 1, 1, 'y'},
        // A quarter turn anticlockwise about the centre: the centre of pixel (i, j), (i - 1.5, j - 0.5) from
        // the middle, goes to (0.5 - j, i - 1.5), so pixel (i, j) lands on (10 - j, 3 + i).
        {{{"Angle", 90}}, 0.5, 0.5, 1, 0, 0, 1, 1, 't'},
        {{{"Size", 2}, {"FilterMethod", 0}}, 0.5, 0.5, 1, 6, 3, 2, 2, ' '},
        {{{"XSize", 2}, {"FilterMethod", 0}}, 0.5, 0.5, 1, 6, 4, 2, 1, ' '},
        {{{"FilterMethod", 0}}, 0.5, 0.5, 2, 6, 4, 2, 1, ' '}, // pixels twice as wide cover two across
        // Made for a frame half the background's size: twice the size, only when the reference size is used.
        {{{"Width", 10}, {"Height", 5}}, 0.5, 0.5, 1, 8, 4, 1, 1, ' '},
        {{{"Width", 10}, {"Height", 5}, {"UseReferenceSize", 1}, {"FilterMethod", 0}}, 0.5, 0.5, 1, 6, 3, 2, 2, ' '},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(&c - cases);
        Ref<Image> fgImage = Numbered(4, 2, 0.5f, c.fgAspect);
        MergeFlow f(Solid(20, 10, kGrey), fgImage);
        SetNumbers(f.merge, c.controls);
        SetPoint(f.merge, "Center", c.cx, c.cy);
        Ref<Image> out = Render(f.merge);
        ASSERT_TRUE(out);
        EXPECT_EQ(out->Width(), 20);
        EXPECT_TRUE(Pixels(*out, [&](int x, int y) {
            const bool turn = c.how == 't';
            int i = turn ? y - 3 : (x - c.x0) / c.sx, j = turn ? 10 - x : (y - c.y0) / c.sy;
            if ((!turn && (x < c.x0 || y < c.y0)) || i < 0 || i >= 4 || j < 0 || j >= 2) return kGrey;
            return fgImage->GetFlt(c.how == 'x' ? 3 - i : i, c.how == 'y' ? 1 - j : j);
        }));
    }
    // The domain is the union of both windows. The foreground hangs off the background's top right corner.
    Ref<Image> fgImage = Numbered(4, 2, 0.5f);
    MergeFlow f(Solid(20, 10, kGrey), fgImage);
    SetPoint(f.merge, "Center", 1.0, 1.0); // centre at (20, 10): pixels (18..21, 9..10)
    Ref<Image> shape = Render(f.merge, nullptr, ReqFlagPreCalc), out = Render(f.merge);
    ASSERT_TRUE(shape && shape->IsNoData() && out);
    EXPECT_EQ(shape->DataWindow(), ImgRectI(0, 0, 22, 11));
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 22, 11));
    EXPECT_EQ(out->GetFlt(21, 10), fgImage->GetFlt(3, 1)); // foreground pixel (i, j) at (18 + i, 9 + j)
}

TEST_F(MergeTool, ControlsFollowTheModeAndTheDocumentsFrameFormat) {
    OrvaneDoc doc;
    doc.SetPref(PREF_FFWidth, 1280);
    Operator *merge = doc.AddTool(OvID("Merge"));
    ASSERT_NE(merge, nullptr);
    // The operator list shows for Normal only.
    SetNumber(merge, "ApplyMode", MrgMultiply);
    EXPECT_FALSE(merge->FindInput("Operator")->IsVisible());
    SetNumber(merge, "ApplyMode", MrgNormal);
    EXPECT_TRUE(merge->FindInput("Operator")->IsVisible());

    Input *w = merge->FindInput("Width"), *h = merge->FindInput("Height");
    ASSERT_TRUE(w && h && w->IsPassive());
    auto value = [](Input *in) { return dynamic_cast<const Number *>(in->Constant().Get())->value; };
    EXPECT_EQ(value(w), 1280.0) << "the default is the document's";
    SetNumbers(merge, {{"Width", 640}, {"Height", 480}});
    doc.SetPref(PREF_FFWidth, 3840);
    doc.SetPref(PREF_FFHeight, 2160);
    SetNumber(merge, "UseFrameFormatSettings", 1);
    EXPECT_TRUE(value(w) == 3840.0 && value(h) == 2160.0);
    EXPECT_FALSE(w->IsVisible() || h->IsVisible());
    SetNumber(merge, "UseFrameFormatSettings", 0);
    EXPECT_TRUE(w->IsVisible());
}

TEST_F(MergeTool, ThePendingTransformSurvivesAndEachSourceIsResampledOnce) {
    // Background -> Transform (a quarter turn) -> Merge. The merge lays the foreground into the background's source and
    // keeps the quarter turn pending: the foreground is resampled once (into that source), the background once (at the
    // end).
    OrvaneDoc doc;
    Ref<Image> bgImage = Numbered(12, 12, 0.9f), fgImage = Numbered(4, 2, 0.5f);
    Operator *xf = doc.AddTool(OvID("Transform")), *merge = doc.AddTool(OvID("Merge"));
    ASSERT_TRUE(xf && merge);
    ASSERT_TRUE(Connect(xf, "Input", AddImageSource(doc, "Back", bgImage)) && Connect(merge, "Background", xf) &&
                Connect(merge, "Foreground", AddImageSource(doc, "Fore", fgImage)));
    SetNumber(xf, "Angle", 90);
    Ref<Image> turned = Render(xf);
    const long before = TransformMatrix::ResampleCount();
    Ref<Image> out = Render(merge);
    ASSERT_TRUE(turned && out);
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 2);
    // What the merge hands on is the turn, still pending, over new pixels.
    Ref<TransformMatrix> pending = MakeRef<TransformMatrix>(bgImage.Get());
    pending->SetSourceToOutput(NormalisedToPixelMatrix(TransformTagsMatrix({{XfAngle, 90.0}}, 12, 12, 1, 1), 12, 12));
    auto *tm = dynamic_cast<TransformMatrix *>(ProcessWith(merge, pending, fgImage).Get());
    ASSERT_NE(tm, nullptr);
    EXPECT_EQ(tm->SourceToOutput(), pending->SourceToOutput());
    EXPECT_NE(tm->Source(), bgImage.Get());
    // The pixels: the foreground over the turned background, in the output frame, as if the turn had been made first.
    EXPECT_TRUE(Pixels(*out, [&](int x, int y) {
        return x >= 4 && x < 8 && y >= 5 && y < 7 ? fgImage->GetFlt(x - 4, y - 5) : turned->GetFlt(x, y);
    }));
}

TEST_F(MergeTool, AChainOfWholePixelMergesResamplesNothing) {
    // Two merges in a row with foregrounds on whole pixels: nothing is
    // resampled at all, and the second merge keeps the first's layer.
    OrvaneDoc doc;
    Ref<Image> a = Numbered(4, 2, 0.3f), b = Numbered(2, 2, 0.7f);
    Operator *m1 = doc.AddTool(OvID("Merge")), *m2 = doc.AddTool(OvID("Merge"));
    ASSERT_TRUE(Connect(m1, "Background", AddImageSource(doc, "Back", Solid(20, 10, kGrey))) &&
                Connect(m1, "Foreground", AddImageSource(doc, "A", a)));
    ASSERT_TRUE(Connect(m2, "Background", m1) && Connect(m2, "Foreground", AddImageSource(doc, "B", b)));
    SetPoint(m2, "Center", 0.25, 0.5); // b's centre at (5, 5): pixels (4..5, 4..5)
    const long before = TransformMatrix::ResampleCount();
    Ref<Image> out = Render(m2);
    ASSERT_TRUE(out && TransformMatrix::ResampleCount() == before);
    EXPECT_TRUE(Pixels(*out, [&](int x, int y) {
        if (x >= 4 && x < 6 && y >= 4 && y < 6) return b->GetFlt(x - 4, y - 4);
        return x >= 8 && x < 12 && y >= 4 && y < 6 ? a->GetFlt(x - 8, y - 4) : kGrey;
    }));
}

TEST_F(MergeTool, ApplyModeAndControlsReachThePixels) {
    // Half-transparent foreground, Screen with blend, green off.
    const FltPixel back{0.4f, 0.5f, 0.6f, 1.f};
    MergeFlow f(Solid(20, 10, back), Solid(4, 2, {0.3f, 0.1f, 0.2f, 0.5f}));
    SetNumbers(f.merge, {{"ApplyMode", MrgScreen}, {"MergeBlend", 0.5}, {"MergeGreen", 0}});
    Ref<Image> out = Render(f.merge);
    ASSERT_TRUE(out);
    // Screen: cs + cb - cs cb where both have alpha (here as 0.5, ab 1: cs (1 - 1) + cb (1 - 0.5) + 0.5 cb + cs - cs
    // cb); then half way back to the background; green stays the background's.
    const double r = 0.3 + 0.4 - 0.3 * 0.4, b = 0.2 + 0.6 - 0.2 * 0.6;
    const FltPixel got = out->GetFlt(9, 5);
    EXPECT_NEAR(got.R, 0.4 + 0.5 * (r - 0.4), 1e-6);
    EXPECT_EQ(got.G, 0.5f);
    EXPECT_NEAR(got.B, 0.6 + 0.5 * (b - 0.6), 1e-6);
    EXPECT_NEAR(got.A, 1.0, 1e-6);
    EXPECT_EQ(out->GetFlt(2, 2), back) << "beyond the foreground";
}

TEST_F(MergeTool, DepthMergeFollowsTheForegroundThroughItsPlacement) {
    // A quarter-turned foreground at depth 1 over a background at depth 2 on the left half and 0.5 on the right: the
    // foreground shows on the left only, and the result's Z is the nearer one.
    Ref<Image> fgImage = Numbered(4, 2, 0.5f), bgImage = Solid(20, 10, kGrey);
    fgImage->AddAuxChannel(AuxChannelKind::Z);
    bgImage->AddAuxChannel(AuxChannelKind::Z);
    for (int y = 0; y < 2; ++y) std::fill_n(fgImage->AuxRow(AuxChannelKind::Z, y), 4, 1.f);
    for (int y = 0; y < 10; ++y)
        for (int x = 0; x < 20; ++x) bgImage->AuxRow(AuxChannelKind::Z, y)[x] = x < 10 ? 2.f : 0.5f;
    MergeFlow f(bgImage, fgImage);
    SetNumbers(f.merge, {{"Angle", 90}, {"PerformDepthMerge", 1}}); // pixel (i, j) on (10 - j, 3 + i)
    Ref<Image> out = Render(f.merge);
    ASSERT_TRUE(out && out->HasAuxChannel(AuxChannelKind::Z));
    for (int y = 3; y < 7; ++y) {
        EXPECT_EQ(out->GetFlt(9, y), fgImage->GetFlt(y - 3, 1)) << y; // in front of depth 2
        EXPECT_EQ(out->GetFlt(10, y), kGrey) << y;                    // behind depth 0.5
        EXPECT_TRUE(out->AuxRow(AuxChannelKind::Z, y)[9] == 1.f && out->AuxRow(AuxChannelKind::Z, y)[10] == 0.5f);
    }
    EXPECT_EQ(out->AuxRow(AuxChannelKind::Z, 0)[3], 2.f) << "the background's Z beyond the foreground";
    SetNumber(f.merge, "PerformDepthMerge", 0);
    EXPECT_EQ(Render(f.merge)->GetFlt(10, 4), fgImage->GetFlt(1, 0)) << "without the switch the foreground lies on top";
}

TEST_F(MergeTool, OnTheDeviceTheToolGivesTheRowsBits) {
    ORVANE_NEED_OPENCL(ctx);
    MergeFlow f(Orvane::Test::PatternImage(40, 22, DepthRGBAFlt32, 22),
                Orvane::Test::PatternImage(24, 14, DepthRGBAFlt32, 21));
    SetPoint(f.merge, "Center", 0.3, 0.6);
    for (int mode : {MrgNormal, MrgScreen, MrgMultiply}) {
        SetNumber(f.merge, "ApplyMode", mode);
        Ref<Image> rows = Render(f.merge);
        RenderTask task;
        task.SetDevice(ctx);
        const int launches = ctx->LaunchCount();
        Ref<Image> dev = Render(f.merge, &task);
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
    ImageSourceTool *l2;
    Operator *mm;
    Ref<Image> bgImage = Solid(20, 10, kGrey), a = Numbered(4, 2, 0.3f), b = Numbered(4, 2, 0.7f);
    MultiFlow() {
        mm = doc.AddTool(OvID("MultiMerge"));
        l2 = AddImageSource(doc, "B", b);
        EXPECT_TRUE(mm && !mm->IsPlaceholder());
        EXPECT_TRUE(Connect(mm, "Background", AddImageSource(doc, "Back", bgImage)));
        EXPECT_TRUE(Connect(mm, "Layer1.Foreground", AddImageSource(doc, "A", a)));
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
    /// The stack with b over a (or a over b), disabled layers left out.
    FltPixel Expected(int x, int y, bool bOnTop, bool bOn = true) const {
        const bool inA = x >= 8 && x < 12 && y >= 4 && y < 6, inB = bOn && x >= 10 && x < 14 && y >= 4 && y < 6;
        if (inB && (!inA || bOnTop)) return b->GetFlt(x - 10, y - 4);
        return inA ? a->GetFlt(x - 8, y - 4) : kGrey;
    }
};

TEST_F(MergeTool, MultiMergeLaysTheLayersInTheListsOrderSkipsDisabledOnesAndBlends) {
    MultiFlow f;
    EXPECT_EQ(LayerOrderOf(f.mm), (std::vector<int>{1, 2})) << "connecting adds to the order";
    EXPECT_EQ(dynamic_cast<const Text *>(f.mm->FindInput("LayerName1")->Constant().Get())->value, "A Layer");
    EXPECT_NE(f.mm->FindInput("Layer3.Foreground"), nullptr);
    Ref<Image> out = Render(f.mm);
    ASSERT_TRUE(out);
    EXPECT_TRUE(Pixels(*out, [&](int x, int y) { return f.Expected(x, y, true); }));
    f.Order({2, 1, 0, -3});
    ASSERT_TRUE(out = Render(f.mm));
    EXPECT_TRUE(Pixels(*out, [&](int x, int y) { return f.Expected(x, y, false); }));

    SetNumber(f.mm, "LayerEnabled2", 0.49); // rounds to 0
    const int rendered = f.l2->processCount;
    ASSERT_TRUE(out = Render(f.mm));
    EXPECT_EQ(f.l2->processCount, rendered) << "a disabled layer's source is not rendered";
    EXPECT_TRUE(Pixels(*out, [&](int x, int y) { return f.Expected(x, y, false, false); }));
    EXPECT_EQ(LayerOrderOf(f.mm), (std::vector<int>{2, 1, 0, -3})) << "it stays in the list";
    SetNumber(f.mm, "LayerEnabled2", 0.5); // rounds to 1
    EXPECT_EQ(Render(f.mm)->GetFlt(12, 4), f.b->GetFlt(2, 0));
    // A LayerOrder that is no table, or an empty one, hands on the Background itself.
    ASSERT_TRUE(f.mm->FindInput("LayerOrder")->SetValue(MakeRef<ScriptValue>(ScriptVal(2.0))));
    EXPECT_EQ(Render(f.mm).Get(), f.bgImage.Get()) << "the Background itself, not a copy";
    f.Order({});
    EXPECT_EQ(Render(f.mm).Get(), f.bgImage.Get());

    // Blend mixes the stack back over the Background.
    f.Order({1, 2});
    Ref<Image> full = Render(f.mm);
    SetNumber(f.mm, "Blend", 0.25);
    const long before = TransformMatrix::ResampleCount();
    Ref<Image> quarter = Render(f.mm);
    ASSERT_TRUE(full && quarter);
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 0) << "mixed in the source, nothing resampled";
    auto mix = [&](double k, int x, int y) {
        const FltPixel s = full->GetFlt(x, y);
        const auto at = [&](float g, float v) { return static_cast<float>(g + k * (v - g)); };
        return FltPixel{at(kGrey.R, s.R), at(kGrey.G, s.G), at(kGrey.B, s.B), at(kGrey.A, s.A)};
    };
    EXPECT_TRUE(Pixels(
        *quarter, [&](int x, int y) { return mix(0.25, x, y); }, 1e-6f));
    // Blend 0 is the Background; switching a channel off keeps its values.
    SetNumber(f.mm, "Blend", 0.0);
    EXPECT_EQ(Render(f.mm)->GetFlt(9, 4), kGrey);
    SetNumbers(f.mm, {{"Blend", 0.5}, {"ProcessRed", 0}});
    Ref<Image> noRed = Render(f.mm);
    EXPECT_EQ(noRed->GetFlt(9, 4).R, kGrey.R);
    EXPECT_NEAR(noRed->GetFlt(9, 4).G, mix(0.5, 9, 4).G, 1e-6);
}

TEST_F(MergeTool, MultiMergeLayersComeBackWithTheDocument) {
    // Values of layer inputs in a document, whatever order they come in.
    const char *text = R"(Orvane.Document { Tools = { Back = Background { Inputs = { Width = 20, Height = 10 } },
        MM = MultiMerge { Inputs = { ["Layer3.Size"] = 2, LayerName3 = "Third", LayerOrder = { 3 },
                                     Background = Back.Output } } } })";
    OrvaneDoc doc;
    DocumentLoadResult r = LoadDocument(text, doc);
    ASSERT_TRUE(r.ok) << r.error;
    Operator *mm = doc.FindTool("MM");
    ASSERT_TRUE(mm && mm->FindInput("Layer3.Size"));
    EXPECT_EQ(dynamic_cast<const Number *>(mm->FindInput("Layer3.Size")->Constant().Get())->value, 2.0);
    EXPECT_EQ(dynamic_cast<const Text *>(mm->FindInput("LayerName3")->Constant().Get())->value, "Third");
    EXPECT_EQ(mm->KeptInputs().Size(), 0u);
    EXPECT_EQ(LayerOrderOf(mm), (std::vector<int>{3}));
}

TEST_F(MergeTool, OverAgreesWithOiiotool) {
    if (!FmtTest::HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
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
    const Orvane::Test::TempDir dir;
    FmtTest::WriteFile(dir / "fg.exr", FmtTest::Save("OpenEXRFormat", fgImage.Get()));
    FmtTest::WriteFile(dir / "bg.exr", FmtTest::Save("OpenEXRFormat", bgImage.Get()));
    ASSERT_TRUE(FmtTest::RunShell("oiiotool " + (dir / "fg.exr") + " " + (dir / "bg.exr") + " --over -d float -o " +
                                  (dir / "over.exr") + " >/dev/null"));
    FmtTest::LoadResult theirs = FmtTest::Load("OpenEXRFormat", FmtTest::ReadFile(dir / "over.exr"));
    ASSERT_TRUE(theirs.image) << theirs.error;

    MergeFlow f(bgImage, fgImage);
    Ref<Image> ours = Render(f.merge);
    ASSERT_TRUE(ours);
    // Both compute A + B (1 - alpha_A) in float; the only room for a difference is the order of the two roundings (or a
    // fused multiply-add on their side): one rounding step of values up to 2, well below 1e-6.
    EXPECT_TRUE(Pixels(
        *ours, [&](int x, int y) { return theirs.image->GetFlt(x, y); }, 1e-6f));
}

} // namespace
} // namespace Orvane::mergetooltest
