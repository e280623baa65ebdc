// The mask frame: its inputs, the paint modes against their written formulas, and the finishing merge of a test mask
// tool that fills a rectangle, checked pixel by pixel (beyond every window, so canvases count) against values worked
// out here; the soft edge against the blur service run directly; a mask limiting another tool; the device merge.
#include <algorithm>
#include <cmath>
#include <functional>
#include <string>

#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/MaskOperator.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/NewImage.h"
#include "host/image/PaintModes.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::maskoperatortest {
namespace ts = ::Orvane::Test;
namespace {

constexpr int W = 48, H = 32;

/// A mask tool that fills its rectangle `box` with 1 (0 outside; the reverse when inverted): the mask frame's work
/// without shapes.
class BoxMask : public MaskOperator {
public:
    BoxMask(const Registry *reg, const ScriptVal &args, const TagList &tags) : MaskOperator(reg, args, tags) {}
    void PreProcess(Request *req) override {
        const std::optional<ImgRectI> dod = GetMaskDoD(req);
        SetMaskRegion(req, dod ? box & *dod : ImgRectI());
        MaskOperator::PreProcess(req);
    }
    void Process(Request *req) override {
        Image *m = GetMaskImage(req);
        if (!m) return;
        const bool invert = req->GetInputNumber(InInvert()) >= 0.5;
        const ImgRectI dw = m->DataWindow();
        if (!req->IsPreCalc())
            for (int y = dw.y0; y < dw.y1; ++y)
                for (int x = dw.x0; x < dw.x1; ++x) {
                    const float v = box.Contains(x, y) != invert ? 1.f : 0.f;
                    m->PutFlt(x, y, {v, v, v, v});
                }
        m->SetCanvasColorFltChan(3, invert ? 1.f : 0.f);
    }
    ImgRectI box;
};

OvID BoxMaskClass() {
    return ts::RegisterTool("TestBoxMask", &ts::MakeTool<BoxMask>,
                            {{RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindMask)},
                             {RegSupportsRoI, 1},
                             {RegSupportsDoD, 1},
                             {RegSupportsGPUImages, 1}});
}

Ref<OrvaneDoc> SmallDoc() {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    doc->SetPref(PREF_FFWidth, W);
    doc->SetPref(PREF_FFHeight, H);
    return doc;
}

BoxMask *AddBox(OrvaneDoc &doc, const char *name, const ImgRectI &box) {
    auto *m = dynamic_cast<BoxMask *>(doc.AddTool(BoxMaskClass(), name));
    if (m) m->box = box;
    return m;
}

/// The paint modes as docs/MASKS.md writes them, before clamping to 0..1.
double Formula(int mode, double l, double i, double m) {
    switch (mode) {
    case PaintAdd: return i + l * m;
    case PaintSubtract: return i - l * m;
    case PaintMinimum: return i + l * (std::min(i, m) - i);
    case PaintMaximum: return i + l * (std::max(i, m) - i);
    case PaintAverage: return i + l * ((i + m) / 2 - i);
    case PaintMultiply: return i * (1 - l + l * m);
    case PaintReplace: return (1 - l) * i + l * m;
    case PaintInvert: return i + l * (i * (1 - m) + (1 - i) * m - i);
    case PaintCopy: return l * m;
    case PaintNone: return i;
    default: return i + l * m - i * l * m; // Merge: the union
    }
}
double Expected(int mode, double l, double i, double m) {
    const double v = Formula(mode, l, i, m);
    return mode == PaintNone ? v : std::clamp(v, 0.0, 1.0);
}

TEST(PaintModes, EveryModeFollowsItsFormulaAndClampsToCoverage) {
    const float values[] = {0.f, 0.25f, 0.6f, 1.f, 1.5f, -0.5f}; // the last two: float masks beyond 0..1
    for (int mode = 0; mode < PaintModeCount; ++mode) {
        EXPECT_EQ(PaintModeIndex(PaintModeID[mode]), mode);
        EXPECT_EQ(PaintModeIndex(PaintModeName[mode]), mode);
        for (float l : {1.f, 0.5f, 0.f, 0.3f})
            for (float i : values) {
                float span[6], below[6];
                std::fill(below, below + 6, i);
                std::copy(std::begin(values), std::end(values), span);
                MergeSpanFlt32(mode, l, below, span, 6);
                for (int k = 0; k < 6; ++k) {
                    const float m = values[k];
                    const float px = Merge_Flt32_Flt32_Pixel(mode, l, i, m);
                    EXPECT_NEAR(px, Expected(mode, l, i, m), 2e-7)
                        << PaintModeName[mode] << " l " << l << " I " << i << " M " << m;
                    EXPECT_EQ(span[k], px) << "the span and the pixel agree";
                }
            }
    }
    EXPECT_EQ(PaintModeIndex("NoSuchMode"), PaintMerge);
    EXPECT_EQ(Merge_Flt32_Flt32_Pixel(42, 1.f, 0.2f, 0.5f), Merge_Flt32_Flt32_Pixel(PaintMerge, 1.f, 0.2f, 0.5f));
}

TEST(MaskOperator, CommonInputsComeFirstInOrderWithTheirLimits) {
    struct Row {
        const char *id, *label;
        OvID control;
        double def, lo, hi, sliderLo, sliderHi;
        int priority;
    };
    const double none = NAN;
    const Row rows[] = {
        {"Level", "Level", CLSID_InputControl_Slider, 1, 0, 1, none, none, 0},
        {"Filter", "Filter", CLSID_InputControl_MultiButtonID, none, none, none, none, none, PriorityLast},
        {"SoftEdge", "Soft Edge", CLSID_InputControl_Slider, 0, 0, 1, 0, 0.2, PriorityLast},
        {"Passes", "Num Passes", CLSID_InputControl_Slider, 4, 1, 64, 1, 16, PriorityLast},
        {"BorderWidth", "Border Width", CLSID_InputControl_Slider, 0, -1, 1, -0.2, 0.2, 0},
        {"PaintMode", "Paint Mode", CLSID_InputControl_ComboID, none, none, none, none, none, 0},
        {"Invert", "Invert", CLSID_InputControl_Checkbox, 0, none, none, none, none, 0},
        {"Solid", "Solid", CLSID_InputControl_Checkbox, 1, none, none, none, none, 0},
        {"JoinStyle", "Border Style", CLSID_InputControl_MultiButton, 0, 0, 3, none, none, 0},
        {"MiterLimit", "Miter Limit", CLSID_InputControl_Slider, 10, none, none, 0, 10, 0},
        {"CapStyle", "Cap Style", CLSID_InputControl_MultiButton, 0, 0, 2, none, none, 0},
        {"WritePosition", "Position", CLSID_InputControl_Range, 0, none, none, 0, 1, 0},
        {"WriteLength", "Length", CLSID_InputControl_Range, 1, none, none, 0, 1, 0},
    };
    Ref<OrvaneDoc> doc = SmallDoc();
    BoxMask *mask = AddBox(*doc, "Box1", {});
    ASSERT_NE(mask, nullptr);
    int index = 0;
    for (const Row &r : rows) {
        SCOPED_TRACE(r.id);
        const Input *in = mask->FindInput(r.id);
        ASSERT_NE(in, nullptr);
        EXPECT_EQ(in->Index(), index++);
        EXPECT_STREQ(in->Label(), r.label);
        EXPECT_EQ(in->Tags().GetID(InputControl), r.control);
        EXPECT_EQ(in->Priority(), r.priority);
        auto expectTag = [&](Tag tag, double want) {
            if (!std::isnan(want)) {
                EXPECT_DOUBLE_EQ(in->Tags().GetDouble(tag, -99), want) << std::hex << tag;
            }
        };
        expectTag(InputDefault, r.def);
        expectTag(InputMinAllowed, r.lo);
        expectTag(InputMaxAllowed, r.hi);
        expectTag(InputSliderLow, r.sliderLo);
        expectTag(InputSliderHigh, r.sliderHi);
    }
    EXPECT_EQ(mask->FindInput("Filter")->Tags().FindAll(ListItemId).size(), 5u);
    EXPECT_EQ(mask->FindInput("PaintMode")->Tags().FindAll(ListItemId).size(), size_t(PaintModeCount));
    EXPECT_EQ(mask->FindInput("JoinStyle")->Tags().FindAll(ButtonIcon).size(), 4u);
    EXPECT_EQ(mask->FindInput("CapStyle")->Tags().FindAll(ButtonIcon).size(), 3u);
    // The Image page and the mask's own common inputs; a mask mixes nothing, so no Blend or mask channel controls.
    for (const char *id : {"MaskWidth", "MaskHeight", "PixelAspect", "Depth", "EffectMask", "ClippingMode"})
        EXPECT_NE(mask->FindInput(id), nullptr) << id;
    for (const char *id : {"Blend", "ProcessRed", "EffectMaskChannel", "EffectMaskInvert", "MultiplyByMask"})
        EXPECT_EQ(mask->FindInput(id), nullptr) << id;
    EXPECT_DOUBLE_EQ(mask->FindInput("MaskWidth")->Tags().GetDouble(InputDefault), W);

    // Passes shows for Multi-box only, and an older document's Soften loads as Multi-box.
    Input *filter = mask->FindInput("Filter");
    for (int f = 0; f < MaskFilterCount; ++f) {
        ASSERT_TRUE(filter->SetValue(MakeRef<IDValue>(OvID(MaskFilterID[f]))));
        EXPECT_EQ(mask->InPasses()->IsVisible(), f == MaskFilterMultiBox) << MaskFilterID[f];
    }
    EXPECT_FALSE(mask->InPasses()->IsVisible());
    ASSERT_TRUE(filter->SetValue(MakeRef<IDValue>(OvID("Soften"))));
    EXPECT_EQ(dynamic_cast<const IDValue &>(*filter->Constant()).value, OvID("Multi-box"));
    EXPECT_TRUE(mask->InPasses()->IsVisible());

    // The default filter is the document's preference.
    for (int pref : {MaskFilterMultiBox, MaskFilterBox}) {
        Ref<OrvaneDoc> d = SmallDoc();
        d->SetPref(PREF_MaskFilter, pref);
        BoxMask *m = AddBox(*d, "Box1", {});
        EXPECT_EQ(dynamic_cast<const IDValue &>(*m->InFilter()->Default()).value, OvID(MaskFilterID[pref]));
        EXPECT_EQ(m->InPasses()->IsVisible(), pref == MaskFilterMultiBox);
    }
}

/// Reads a mask's value at (x, y) (its canvas value outside its data window).
float At(const Image &img, int x, int y) { return img.GetFlt(x, y).A; }

TEST(MaskOperator, TheFinishingMergeFollowsThePaintModeOverEveryWindowAndCanvas) {
    struct Case {
        const char *name;
        ImgRectI box;               ///< this mask's rectangle
        std::optional<ImgRectI> in; ///< the incoming mask's rectangle, none: no incoming mask
        int mode = PaintMerge;
        double level = 1.0;
        bool invert = false, inInvert = false;
        int depth = 4, inDepth = 1; ///< Depth choices: 1 int8 .. 4 float32
        std::optional<ImgRectI> roi = std::nullopt;
    };
    const ImgRectI a(4, 4, 20, 16);
    const Case cases[] = {
        {"alone at level 0.7", a, std::nullopt, PaintMerge, 0.7},
        {"alone at level 1", a, std::nullopt},
        {"incoming inside", a, ImgRectI(8, 6, 14, 12)},
        {"incoming overlapping, add", a, ImgRectI(12, 10, 30, 28), PaintAdd, 0.6},
        {"incoming disjoint, subtract", a, ImgRectI(26, 18, 40, 30), PaintSubtract},
        {"overlapping, minimum at half level", a, ImgRectI(12, 10, 30, 28), PaintMinimum, 0.5},
        {"maximum", a, ImgRectI(12, 10, 30, 28), PaintMaximum, 0.8},
        {"average", a, ImgRectI(12, 10, 30, 28), PaintAverage},
        {"multiply, inverted incoming: canvas 1 below", a, ImgRectI(12, 10, 30, 28), PaintMultiply, 0.9, false, true},
        {"replace", a, ImgRectI(12, 10, 30, 28), PaintReplace, 0.4},
        {"invert", a, ImgRectI(12, 10, 30, 28), PaintInvert},
        {"copy ignores what is below", a, ImgRectI(12, 10, 30, 28), PaintCopy, 0.5},
        {"none hands the incoming mask on", a, ImgRectI(12, 10, 30, 28), PaintNone},
        {"int16 mask over float32 incoming", a, ImgRectI(12, 10, 30, 28), PaintMerge, 0.75, false, false, 2, 4},
        {"empty shape inverted is 1 everywhere", ImgRectI(), std::nullopt, PaintMerge, 1.0, true},
        {"empty clear shape over incoming", ImgRectI(), ImgRectI(12, 10, 30, 28)},
        {"inverted over inverted incoming", a, ImgRectI(12, 10, 30, 28), PaintMerge, 1.0, true, true},
        {"a region of interest", a, ImgRectI(12, 10, 30, 28), PaintMerge, 1.0, false, false, 4, 1,
         ImgRectI(10, 2, 25, 14)},
        {"a region beyond the frame", a, ImgRectI(30, 10, 60, 28), PaintAdd, 1.0, false, false, 4, 1,
         ImgRectI(-6, -3, 56, 40)},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = SmallDoc();
        BoxMask *top = AddBox(*doc, "Top", c.box);
        ts::SetNumbers(top, {{"Level", c.level}, {"Invert", c.invert}, {"Depth", c.depth}});
        ts::SetID(top, "PaintMode", PaintModeID[c.mode]);
        BoxMask *below = nullptr;
        if (c.in) {
            below = AddBox(*doc, "Below", *c.in);
            ts::SetNumbers(below, {{"Invert", c.inInvert}, {"Depth", c.inDepth}});
            ASSERT_TRUE(top->FindInput("EffectMask")->ConnectTo(below->OutMask()));
        }
        const ImgRectI *roi = c.roi ? &*c.roi : nullptr;
        Ref<Image> out = ts::EvalImage(top, 0.0, roi);
        ASSERT_NE(out, nullptr);
        EXPECT_TRUE(out->IsMask());
        // Paint mode None, and an empty clear shape merged over a mask, hand the incoming mask on as it is.
        const bool handedOn = c.in && (c.mode == PaintNone || (c.box.IsNull() && !c.invert && c.mode == PaintMerge));
        EXPECT_EQ(out->Depth(), handedOn ? c.inDepth : c.in ? std::max(c.depth, c.inDepth) : c.depth);
        if (handedOn) {
            EXPECT_EQ(out->DataWindow(), ts::EvalImage(below, 0.0, roi)->DataWindow()) << "the incoming mask's";
        }
        const ImgRectI want = roi ? *roi : ImgRectI(0, 0, W, H);
        EXPECT_TRUE(want.Contains(out->DataWindow())) << ts::RectText(out->DataWindow());
        if (!handedOn) {
            EXPECT_EQ(out->ValidWindow(), out->DataWindow() & want);
        }
        const int mode = c.in ? c.mode : PaintCopy;
        const double tol = c.depth == 2 ? 1.0 / 65535 : 1e-6;
        for (int y = want.y0 - 5; y < want.y1 + 5; ++y)
            for (int x = want.x0 - 5; x < want.x1 + 5; ++x) {
                // Beyond the region asked for, everything is the canvas value.
                const bool asked = want.Contains(x, y);
                const int px = asked ? x : -1000, py = asked ? y : -1000;
                const double m = c.box.Contains(px, py) != c.invert ? 1.0 : 0.0;
                const double i = c.in ? (c.in->Contains(px, py) != c.inInvert ? 1.0 : 0.0) : 0.0;
                ASSERT_NEAR(At(*out, x, y), Expected(mode, c.level, i, m), tol) << x << "," << y;
            }
    }
}

TEST(MaskOperator, TheSoftEdgeIsTheBlurOfTheHardMaskAndBoxIgnoresPasses) {
    const ImgRectI box(14, 10, 30, 22);
    const double soft = 0.06; // 2.88 pixels of a 48-wide mask
    Ref<Image> hard = NewImageTagList({{ImgWidth, W}, {ImgHeight, H}, {ImgDepth, DepthAFlt32}});
    ASSERT_TRUE(hard && hard->AllocScanLineData());
    hard->FillWithin({1, 1, 1, 1}, box);
    const struct {
        int filter, passes, blurType, blurPasses; // the blur run here for the same look
    } cases[] = {{MaskFilterBox, 7, BlurMultiBox, 1},
                 {MaskFilterBox, 1, BlurMultiBox, 1},
                 {MaskFilterBartlett, 3, BlurBartlett, 3},
                 {MaskFilterMultiBox, 3, BlurMultiBox, 3},
                 {MaskFilterMultiBox, 1, BlurMultiBox, 1},
                 {MaskFilterGaussian, 4, BlurGaussian, 4},
                 {MaskFilterFastGaussian, 2, BlurFastGaussian, 2}};
    for (const auto &c : cases) {
        SCOPED_TRACE(std::string(MaskFilterID[c.filter]) + " passes " + std::to_string(c.passes));
        Ref<Image> want = hard->BlurOfImageTagList(
            {{BlurFilterType, c.blurType}, {BlurPasses, c.blurPasses}, {BlurXSize, soft}, {BlurYSize, soft}});
        ASSERT_NE(want, nullptr);
        Ref<OrvaneDoc> doc = SmallDoc();
        BoxMask *mask = AddBox(*doc, "Soft", box);
        ts::SetNumbers(mask, {{"SoftEdge", soft}, {"Passes", c.passes}});
        ts::SetID(mask, "Filter", MaskFilterID[c.filter]);
        Ref<Image> out = ts::EvalImage(mask);
        ASSERT_NE(out, nullptr);
        EXPECT_GT(At(*out, box.x0 - 1, 15), 0.02f) << "the edge spreads beyond the shape";
        EXPECT_LT(At(*out, box.x0, 15), 0.98f);
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) ASSERT_NEAR(At(*out, x, y), At(*want, x, y), 2e-6) << x << "," << y;
    }
}

TEST(MaskOperator, AMaskOnAToolsEffectMaskLimitsTheEffectToItsShape) {
    ts::LoadOperators();
    Ref<OrvaneDoc> doc = SmallDoc();
    Ref<Image> grey = NewImageTagList({{ImgWidth, W}, {ImgHeight, H}, {ImgDepth, DepthRGBAFlt32}});
    ASSERT_TRUE(grey && grey->AllocScanLineData());
    grey->Fill({0.25f, 0.25f, 0.25f, 1.f});
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", grey);
    Operator *bc = doc->AddTool(OvID("BrightnessContrast"), "BC1");
    ASSERT_NE(bc, nullptr);
    ASSERT_TRUE(bc->FindInput("Input")->ConnectTo(src->Out()));
    ts::SetNumber(bc, "Gain", 2.0);
    const ImgRectI box(6, 5, 21, 17);
    for (bool invert : {false, true}) {
        BoxMask *mask = AddBox(*doc, invert ? "Inverted" : "Plain", box);
        ts::SetNumber(mask, "Invert", invert);
        ASSERT_TRUE(bc->FindInput("EffectMask")->ConnectTo(mask->OutMask()));
        Ref<Image> out = ts::EvalImage(bc);
        ASSERT_NE(out, nullptr);
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x)
                ASSERT_NEAR(out->GetFlt(x, y).R, box.Contains(x, y) != invert ? 0.5f : 0.25f, 1e-6)
                    << x << "," << y << (invert ? " inverted" : "");
    }
}

TEST(MaskOperator, AFinishedMaskRecordsTheMaskDomainFlagOfItsRequest) {
    for (bool flagged : {true, false}) {
        Ref<OrvaneDoc> doc = SmallDoc();
        BoxMask *mask = AddBox(*doc, "Box1", ImgRectI(2, 2, 9, 9));
        EvalOptions options;
        options.useCache = false;
        options.flags = flagged ? ReqFlagMaskDomain : 0;
        Ref<Image> out = ts::EvalImage(mask, 0.0, options);
        ASSERT_NE(out, nullptr);
        const ScriptVal *mark = out->Metadata().Find(MaskDomainKey);
        EXPECT_EQ(mark && mark->AsBool(), flagged);
    }
}

/// A w x h mask of `depth` whose data window `dw` holds values over -0.25..1.25 (stored clamped at integer depths).
Ref<Image> PatternMask(int depth, const ImgRectI &dw, unsigned seed, float canvas) {
    const FltPixel c{canvas, canvas, canvas, canvas};
    Ref<Image> img =
        NewImageTagList({{ImgWidth, W}, {ImgHeight, H}, {ImgDepth, depth}, {ImgDataWindow, &dw}, {ImgCanvasColor, &c}});
    if (!img || !img->AllocScanLineData()) return nullptr;
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const float v = std::fmod((x + 50) * 0.37f + (y + 50) * 0.61f + seed * 0.13f, 1.5f) - 0.25f;
            img->PutFlt(x, y, {v, v, v, v});
        }
    return img;
}

TEST(MaskOperator, TheDeviceMergeGivesTheRowsResult) {
    ORVANE_NEED_OPENCL(ctx);
    const ImgRectI mw(-3, 2, 40, 30), iw(5, -4, 52, 20); // windows that meet partly
    for (int depth : {DepthAFlt32, DepthAFlt16, DepthAInt16, DepthAInt8})
        for (int inDepth : {DepthAInt8, DepthAFlt32})
            for (int mode = 0; mode < PaintModeCount; ++mode)
                for (double level : {1.0, 0.6}) {
                    SCOPED_TRACE("depth " + std::to_string(depth) + " below " + std::to_string(inDepth) + " " +
                                 PaintModeName[mode] + " level " + std::to_string(level));
                    Ref<Image> below = PatternMask(inDepth, iw, 3, 1.f);
                    Ref<Image> cpu = PatternMask(depth, mw, 5, 0.f), dev = CopyOfImage(cpu.Get());
                    ASSERT_TRUE(MaskOperator::MergeCPU(nullptr, cpu.Get(), below.Get(), mode, level));
                    ts::DeviceRender render(ctx);
                    const int launches = ctx->LaunchCount();
                    ASSERT_TRUE(MaskOperator::MergeGPU(&render.req, dev.Get(), below.Get(), mode, level));
                    EXPECT_EQ(ctx->LaunchCount(), launches + 1) << "the device ran it";
                    ASSERT_TRUE(dev->IsGPUMemDirty() && dev->DownloadGPUMem());
                    // Integers round v x 65535 + 1/2 in float on the device: one code at most.
                    const double tol = depth == DepthAInt8    ? 1 / 255.0 + 1e-7
                                       : depth == DepthAInt16 ? 1 / 65535.0 + 1e-7
                                                              : 0;
                    for (int y = mw.y0; y < mw.y1; ++y)
                        for (int x = mw.x0; x < mw.x1; ++x)
                            ASSERT_NEAR(At(*dev, x, y), At(*cpu, x, y), tol) << x << "," << y;
                }
}

} // namespace
} // namespace Orvane::maskoperatortest
