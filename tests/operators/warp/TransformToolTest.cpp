// The Transform tool in the flow: its controls, what travels on its output
// (a pending transform for inputs that take one, pixels for the others),
// chains that resample once, flattening, regions of interest, domains, the
// common controls and caching. Pixels are compared with a single transform
// made directly on the image (TransformMatrixTest checks those against the
// filters' formulas) or with hand-computed values.
#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <vector>

#include "host/flow/ResultCache.h"
#include "host/image/TransformMatrix.h"
#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest {
namespace {

/// A consumer that notes the value it gets on its image input and hands on
/// its pixels. `Takes` declares LinkSecondDataType TransformMatrix.
template <bool Takes> class ValueProbe : public ThreadedOperator {
public:
    ValueProbe(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        TagList in{{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}};
        if (Takes) in.Add({LinkSecondDataType, CLSID_DataType_TransformMatrix});
        input_ = AddInputTagList("Input", "Input", in);
        output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        Parameter *v = req->GetInputData(input_);
        if (!req->IsPreCalc())
            seen.emplace_back(v);
        else
            dod = req->GetInputDoD(input_);
        TagList cut{{WorkRequest, static_cast<const void *>(req)}};
        const AutoImageRoI roi(req);
        if (roi) cut.Set({ImgDataWindow, &roi->rect});
        req->SetOutputData(output_, ImageOfValue(v, cut).Get());
    }
    std::vector<Ref<Parameter>> seen; ///< values of the pixel requests
    std::optional<ImageDomain> dod;   ///< the input's domain, as the engine told it

private:
    Input *input_;
    Output *output_;
};

template <bool Takes> ValueProbe<Takes> *AddConsumer(OrvaneDoc &doc, Operator *src) {
    static const OvID cls(Takes ? "TestTakesTransforms" : "TestTakesImages");
    static const Registry *row = [] {
        TagList tags{{RegConstructor,
                      +[](const Registry *reg, const ScriptVal &args, const TagList &t) -> Object * {
                          return new ValueProbe<Takes>(reg, args, t);
                      }},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)},
                     {RegName, "Test Consumer"},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1},
                     {RegSupportsRoI, 1},
                     {RegSupportsDoD, 1}};
        return Registry::_Init(&ClassRegistry, cls, tags);
    }();
    (void)row;
    auto *probe = dynamic_cast<ValueProbe<Takes> *>(doc.AddTool(cls));
    EXPECT_NE(probe, nullptr);
    if (probe) {
        EXPECT_TRUE(probe->FindInput("Input")->ConnectTo(src->FindMainOutput()));
    }
    return probe;
}

class TransformTool : public ::testing::Test {
protected:
    void SetUp() override { LoadOperators(); }
};

/// A smooth picture with a non-constant alpha and a canvas.
Ref<Image> Picture(int w = 48, int h = 40) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, 8}});
    img->AllocScanLineData();
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const float v = 0.5f + 0.3f * std::sin(x * 0.3f) * std::cos(y * 0.23f);
            img->PutFlt(x, y, {v, 1 - v, 0.2f, 0.5f + 0.5f * v});
        }
    return img;
}

/// The pixels a single transform with `tags` makes of `src` over `cut`.
Ref<Image> Direct(Image *src, const TagList &tags, const ImgRectI *cut = nullptr) {
    auto tm = MakeRef<TransformMatrix>(src);
    EXPECT_TRUE(tm->ImageConcatenateTagList(tags));
    TagList apply;
    if (cut) apply.Set({ImgDataWindow, cut});
    return tm->ApplyTransformTagList(apply);
}

TEST_F(TransformTool, RegistersWithItsControlsInOrder) {
    const Registry *row = ClassRegistry->Find(OvID("Transform"));
    ASSERT_NE(row, nullptr);
    EXPECT_EQ(row->TypeFlags(), RegKindOperator | RegKindTool);
    EXPECT_EQ(row->BaseID(), CLSID_ThreadedOperator);
    EXPECT_STREQ(row->Tags().GetText(RegAbbreviation, ""), "Xf");
    EXPECT_STREQ(row->Tags().GetText(RegPath, ""), "Tools/Transform/Transform");
    for (Tag on : {RegSupportsRoI, RegSupportsDoD, RegSupportsGPUImages}) EXPECT_TRUE(row->Tags().GetBool(on));

    OrvaneDoc doc;
    Operator *xf = doc.AddTool(OvID("Transform"));
    ASSERT_NE(xf, nullptr);
    EXPECT_FALSE(xf->IsPlaceholder());
    const char *order[] = {
        "Center",       "Pivot",           "UseSizeAndAspect", "Size",     "Aspect", "XSize",
        "YSize",        "Angle",           "FlipHoriz",        "FlipVert", "Edges",  "FilterMethod",
        "WindowMethod", "InvertTransform", "FlattenTransform", "Width",    "Height", "UseFrameFormatSettings",
        "Input"};
    int last = -1;
    for (const char *id : order) {
        const Input *in = xf->FindInput(id);
        ASSERT_NE(in, nullptr) << id;
        EXPECT_GT(in->Index(), last) << id;
        last = in->Index();
    }
    EXPECT_DOUBLE_EQ(xf->FindInput("Aspect")->Tags().GetDouble(InputMinAllowed), 0.01);
    EXPECT_DOUBLE_EQ(xf->FindInput("FilterMethod")->Tags().GetDouble(InputDefault), 2.0);
    EXPECT_TRUE(xf->FindInput("Width")->IsPassive());
    bool takes = false;
    for (const TagItem *t : xf->FindInput("Input")->Tags().FindAll(LinkSecondDataType))
        takes |= t->AsID() == CLSID_DataType_TransformMatrix;
    EXPECT_TRUE(takes);

    // Size and Aspect, or X Size and Y Size; the window list for Sinc and Bessel only.
    auto shown = [&](const char *id) { return xf->FindInput(id)->IsVisible(); };
    EXPECT_TRUE(shown("Size") && shown("Aspect") && !shown("XSize") && !shown("YSize") && !shown("WindowMethod"));
    SetNumber(xf, "UseSizeAndAspect", 0);
    EXPECT_TRUE(!shown("Size") && !shown("Aspect") && shown("XSize") && shown("YSize"));
    SetNumber(xf, "FilterMethod", 9);
    EXPECT_TRUE(shown("WindowMethod"));
    SetNumber(xf, "FilterMethod", 8);
    EXPECT_FALSE(shown("WindowMethod"));
    // Hard limits: Aspect never reaches 0, Edges stays within its four buttons.
    SetNumber(xf, "Aspect", 0);
    EXPECT_DOUBLE_EQ(dynamic_cast<const Number *>(xf->FindInput("Aspect")->Constant().Get())->value, 0.01);
}

TEST_F(TransformTool, ConsumersGetATransformOrPixelsAsTheyDeclare) {
    Ref<Image> pic = Picture();
    OrvaneDoc doc;
    ProbeSource *src = AddProbe(doc, pic);
    Operator *xf = AddTool(doc, "Transform", src);
    SetNumber(xf, "Angle", 30);
    auto *takes = AddConsumer<true>(doc, xf);
    auto *images = AddConsumer<false>(doc, xf);
    ASSERT_TRUE(Render(takes) && Render(images));
    ASSERT_EQ(takes->seen.size(), 1u);
    ASSERT_EQ(images->seen.size(), 1u);
    auto *tm = dynamic_cast<TransformMatrix *>(takes->seen[0].Get());
    ASSERT_NE(tm, nullptr);
    EXPECT_EQ(tm->Source(), pic.Get());
    auto *img = dynamic_cast<Image *>(images->seen[0].Get());
    ASSERT_NE(img, nullptr);
    // The pixels are the transform's, and the domain the engine reported is
    // the transform's output window in the output frame.
    ExpectSamePixels(*img, *tm->ApplyTransformTagList({}), ImgRectI(-5, -5, 53, 45));
    ASSERT_TRUE(takes->dod);
    EXPECT_EQ(takes->dod->rect, tm->OutputDataWindow());
    EXPECT_EQ(takes->dod->frame, ImgRectI(0, 0, 48, 40));
    // Whoever asks from outside gets pixels too.
    Ref<Image> outside = Render(xf);
    ASSERT_TRUE(outside);
    ExpectSamePixels(*outside, *img, ImgRectI(-5, -5, 53, 45));

    // With nothing to do the input image itself is handed on.
    SetNumber(xf, "Angle", 0);
    Ref<Image> same = Render(xf);
    EXPECT_EQ(same.Get(), pic.Get());
}

TEST_F(TransformTool, AChainResamplesOnceAndEqualsOneTransform) {
    Ref<Image> pic = Picture();
    OrvaneDoc doc;
    ProbeSource *src = AddProbe(doc, pic);
    Operator *first = AddTool(doc, "Transform", src);
    SetNumber(first, "Angle", 20);
    SetNumber(first, "Size", 1.2);
    SetNumber(first, "FilterMethod", 5); // Catmull-Rom
    Operator *second = AddTool(doc, "Transform", first);
    SetNumber(second, "Angle", 15);
    SetNumber(second, "Size", 1.1);
    SetPoint(second, "Center", 0.55, 0.45);
    SetNumber(second, "FilterMethod", 5);

    long before = TransformMatrix::ResampleCount();
    Ref<Image> chained = Render(second);
    ASSERT_TRUE(chained);
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 1);
    // One transform with the combined controls (about the same pivot, the
    // second's move added after).
    Ref<Image> once = Direct(pic.Get(), {{XfAngle, 35.0},
                                         {XfXSize, 1.32},
                                         {XfYSize, 1.32},
                                         {XfCenterX, 0.55},
                                         {XfCenterY, 0.45},
                                         {XfFilter, RszCatmullRom}});
    ASSERT_EQ(chained->DataWindow(), once->DataWindow());
    double worst = 0;
    for (int y = once->DataWindow().y0; y < once->DataWindow().y1; ++y)
        for (int x = once->DataWindow().x0; x < once->DataWindow().x1; ++x)
            worst = std::max(worst, std::fabs(double(chained->GetFlt(x, y).G) - once->GetFlt(x, y).G));
    EXPECT_LT(worst, 1e-5); // the two matrices differ only in rounding

    // Flattening the first makes its pixels at once: two resamplings, and
    // its output is a plain image.
    SetNumber(first, "FlattenTransform", 1);
    auto *probe = AddConsumer<true>(doc, first);
    before = TransformMatrix::ResampleCount();
    ASSERT_TRUE(Render(second));
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 2);
    ASSERT_TRUE(Render(probe));
    ASSERT_FALSE(probe->seen.empty());
    EXPECT_NE(dynamic_cast<Image *>(probe->seen.back().Get()), nullptr);
}

TEST_F(TransformTool, ARegionNeedsOnlyWhatItReads) {
    Ref<Image> pic = Picture(64, 64);
    for (int edges : {0, 2}) {
        SCOPED_TRACE(edges);
        OrvaneDoc doc;
        ProbeSource *src = AddProbe(doc, pic);
        Operator *a = AddTool(doc, "Transform", src);
        SetNumber(a, "Angle", 40);
        SetNumber(a, "Size", 0.7);
        SetNumber(a, "FilterMethod", 8); // Lanczos
        SetNumber(a, "Edges", edges);
        Operator *b = AddTool(doc, "Transform", a);
        SetNumber(b, "Angle", -25);
        SetNumber(b, "Size", 1.6);
        SetPoint(b, "Center", 0.6, 0.52);
        SetNumber(b, "FilterMethod", 9); // Sinc, the widest
        SetNumber(b, "Edges", edges);
        const ImgRectI region(20, 25, 36, 33);
        Ref<Image> whole = Render(b);
        src->asked.clear();
        Ref<Image> part = Render(b, {.roi = region});
        ASSERT_TRUE(whole && part);
        EXPECT_EQ(part->DataWindow(), region);
        ExpectSamePixels(*part, *whole, region);
        ASSERT_EQ(src->asked.size(), 1u);
        if (edges == EdgeCanvas) {
            ASSERT_TRUE(src->asked[0]);
            // A 16 x 8 region reads about 48 x 48 of the source through the
            // two steps and the widest filter's reach.
            const ImgRectI r = src->asked[0]->rect;
            EXPECT_TRUE(r.Width() < 64 && r.Height() < 64) << r.x0 << " " << r.y0 << " " << r.x1 << " " << r.y1;
        } else {
            EXPECT_FALSE(src->asked[0]); // folding edges read the whole frame
        }
    }
}

TEST_F(TransformTool, EdgesFillTheFrameAndInvertUndoes) {
    Ref<Image> pic = Picture(32, 32);
    OrvaneDoc doc;
    ProbeSource *src = AddProbe(doc, pic);
    Operator *xf = AddTool(doc, "Transform", src);
    SetNumber(xf, "Size", 0.5);
    SetNumber(xf, "Edges", 1); // Wrap: the picture repeats four times over the frame
    SetNumber(xf, "FilterMethod", 0);
    Ref<Image> tiled = Render(xf);
    ASSERT_TRUE(tiled);
    EXPECT_EQ(tiled->DataWindow(), ImgRectI(0, 0, 32, 32));
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 16; ++x) {
            // Nearest at half size about the middle: the centre of output
            // pixel x lands on source 2x - 15, folded into 0..31.
            const FltPixel p = tiled->GetFlt(x, y);
            EXPECT_EQ(p, tiled->GetFlt(x + 16, y));
            EXPECT_EQ(p, tiled->GetFlt(x, y + 16));
            EXPECT_EQ(p, pic->GetFlt((2 * x + 17) % 32, (2 * y + 17) % 32)) << x << "," << y;
        }

    // A Transform with the same controls inverted after it gives the
    // identity: the source comes through untouched.
    SetNumber(xf, "Edges", 0);
    SetNumber(xf, "Angle", 33);
    SetPoint(xf, "Pivot", 0.3, 0.6);
    Operator *undo = AddTool(doc, "Transform", xf);
    SetNumber(undo, "Size", 0.5);
    SetNumber(undo, "Angle", 33);
    SetPoint(undo, "Pivot", 0.3, 0.6);
    SetNumber(undo, "InvertTransform", 1);
    const long before = TransformMatrix::ResampleCount();
    Ref<Image> back = Render(undo);
    EXPECT_EQ(back.Get(), pic.Get());
    EXPECT_EQ(TransformMatrix::ResampleCount(), before);

    // Size 0 is singular: inverting leaves it, and nothing of the picture shows.
    SetNumber(xf, "Size", 0);
    SetNumber(xf, "InvertTransform", 1);
    Ref<Image> none = Render(xf);
    ASSERT_TRUE(none);
    EXPECT_TRUE(none->DataWindow().IsNull());
}

TEST_F(TransformTool, BlendMixesThePixelsOfTheTransform) {
    Ref<Image> pic = Picture();
    OrvaneDoc doc;
    ProbeSource *src = AddProbe(doc, pic);
    Operator *xf = AddTool(doc, "Transform", src);
    SetNumber(xf, "Angle", 12);
    SetNumber(xf, "Blend", 0.25);
    Ref<Image> mixed = Render(xf);
    Ref<Image> full = Direct(pic.Get(), {{XfAngle, 12.0}, {XfFilter, RszLinear}});
    ASSERT_TRUE(mixed && full);
    for (int y = 0; y < 40; y += 3)
        for (int x = 0; x < 48; x += 3) {
            const float expect = pic->GetFlt(x, y).R + (full->GetFlt(x, y).R - pic->GetFlt(x, y).R) * 0.25f;
            EXPECT_NEAR(mixed->GetFlt(x, y).R, expect, 1e-6) << x << "," << y;
        }
}

TEST_F(TransformTool, CachedResultsAreNotResampledAgain) {
    OrvaneDoc doc;
    ProbeSource *src = AddProbe(doc, Picture());
    Operator *xf = AddTool(doc, "Transform", src);
    SetNumber(xf, "Angle", 45);
    auto *consumer = AddConsumer<false>(doc, xf);
    RenderOptions cached;
    cached.useCache = true;
    ASSERT_TRUE(Render(consumer, cached));
    const long before = TransformMatrix::ResampleCount();
    const size_t asked = src->asked.size();
    ASSERT_TRUE(Render(consumer, cached));
    EXPECT_EQ(TransformMatrix::ResampleCount(), before);
    EXPECT_EQ(src->asked.size(), asked);
    // A new angle is a new result.
    SetNumber(xf, "Angle", 46);
    ASSERT_TRUE(Render(consumer, cached));
    EXPECT_EQ(TransformMatrix::ResampleCount(), before + 1);
}

TEST_F(TransformTool, AMissingInputFailsWithOneLine) {
    OrvaneDoc doc;
    Operator *xf = doc.AddTool(OvID("Transform"));
    ASSERT_NE(xf, nullptr);
    EXPECT_EQ(Render(xf), nullptr);
    const auto lines = doc.ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].text.rfind(xf->Name(), 0), 0u) << lines[0].text;
}

} // namespace
} // namespace Orvane::WarpTest
