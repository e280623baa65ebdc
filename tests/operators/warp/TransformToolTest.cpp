// The Transform tool in the flow: controls, what travels on its output (a pending transform or pixels), chains
// resampling once, flattening, regions, domains, blend and caching. Pixels are compared with one transform made
// directly on the image (TransformMatrixTest checks those against the filters' formulas) or hand-computed values.
#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <vector>

#include "host/flow/ResultCache.h"
#include "host/image/TransformMatrix.h"
#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest {
namespace {

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

class TransformTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    /// A Transform of `img` (default: the picture) with these controls.
    Operator *Make(const std::vector<std::pair<const char *, double>> &controls, Ref<Image> img = nullptr) {
        src = AddProbe(doc, img ? img : pic, "Src" + std::to_string(++sources));
        return AddTool(doc, "Transform", src, controls);
    }
    OrvaneDoc doc;
    Ref<Image> pic = Picture();
    ProbeSource *src = nullptr;
    int sources = 0;
};

/// The pixels a single transform with `tags` makes of `src` over `cut`.
Ref<Image> Direct(Image *src, const TagList &tags, const ImgRectI *cut = nullptr) {
    auto tm = MakeRef<TransformMatrix>(src);
    EXPECT_TRUE(tm->ImageConcatenateTagList(tags));
    TagList apply;
    if (cut) apply.Set({ImgDataWindow, cut});
    return tm->ApplyTransformTagList(apply);
}

TEST_F(TransformTool, ConsumersGetATransformOrPixelsCachedAndBlended) {
    Operator *xf = Make({{"Angle", 30}});
    auto *takes = AddValueProbe(doc, xf, true);
    auto *images = AddValueProbe(doc, xf, false);
    ASSERT_TRUE(Render(takes) && Render(images) && takes->seen.size() == 1 && images->seen.size() == 1);
    auto *tm = dynamic_cast<TransformMatrix *>(takes->seen[0].Get());
    auto *img = dynamic_cast<Image *>(images->seen[0].Get());
    ASSERT_TRUE(tm && img);
    EXPECT_EQ(tm->Source(), pic.Get());
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
    // A cached result is not resampled again; a new angle is a new result.
    const long before = TransformMatrix::ResampleCount();
    const size_t asked = src->asked.size();
    ASSERT_TRUE(Render(images, {.useCache = true}) && Render(images, {.useCache = true}));
    EXPECT_EQ(TransformMatrix::ResampleCount(), before + 1);
    EXPECT_EQ(src->asked.size(), asked + 1);
    SetNumber(xf, "Angle", 46);
    ASSERT_TRUE(Render(images, {.useCache = true}));
    EXPECT_EQ(TransformMatrix::ResampleCount(), before + 2);
    // Blend mixes the pixels of the transform.
    SetNumbers(xf, {{"Angle", 12}, {"Blend", 0.25}});
    Ref<Image> mixed = Render(xf), full = Direct(pic.Get(), {{XfAngle, 12.0}, {XfFilter, RszLinear}});
    ASSERT_TRUE(mixed && full);
    for (int y = 0; y < 40; y += 3)
        for (int x = 0; x < 48; x += 3) {
            const float expect = pic->GetFlt(x, y).R + (full->GetFlt(x, y).R - pic->GetFlt(x, y).R) * 0.25f;
            EXPECT_NEAR(mixed->GetFlt(x, y).R, expect, 1e-6) << x << "," << y;
        }
    // With nothing to do the input image itself is handed on.
    SetNumbers(xf, {{"Angle", 0}, {"Blend", 1}});
    EXPECT_EQ(Render(xf).Get(), pic.Get());
}

TEST_F(TransformTool, AChainResamplesOnceAndEqualsOneTransform) {
    Operator *first = Make({{"Angle", 20}, {"Size", 1.2}, {"FilterMethod", 5}}); // Catmull-Rom
    Operator *second = AddTool(doc, "Transform", first, {{"Angle", 15}, {"Size", 1.1}, {"FilterMethod", 5}});
    SetPoint(second, "Center", 0.55, 0.45);

    long before = TransformMatrix::ResampleCount();
    Ref<Image> chained = Render(second);
    ASSERT_TRUE(chained);
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 1);
    // One transform with the combined controls (about the same pivot, the second's move added after).
    const TagList combined{{XfAngle, 35.0},   {XfXSize, 1.32},   {XfYSize, 1.32},
                           {XfCenterX, 0.55}, {XfCenterY, 0.45}, {XfFilter, RszCatmullRom}};
    Ref<Image> once = Direct(pic.Get(), combined);
    ASSERT_EQ(chained->DataWindow(), once->DataWindow());
    double worst = 0;
    for (int y = once->DataWindow().y0; y < once->DataWindow().y1; ++y)
        for (int x = once->DataWindow().x0; x < once->DataWindow().x1; ++x)
            worst = std::max(worst, std::fabs(double(chained->GetFlt(x, y).G) - once->GetFlt(x, y).G));
    EXPECT_LT(worst, 1e-5); // the two matrices differ only in rounding

    // Flattening the first makes its pixels at once: two resamplings, and its output is a plain image.
    SetNumber(first, "FlattenTransform", 1);
    auto *probe = AddValueProbe(doc, first, true);
    before = TransformMatrix::ResampleCount();
    ASSERT_TRUE(Render(second));
    EXPECT_EQ(TransformMatrix::ResampleCount() - before, 2);
    ASSERT_TRUE(Render(probe) && !probe->seen.empty());
    EXPECT_NE(dynamic_cast<Image *>(probe->seen.back().Get()), nullptr);
}

TEST_F(TransformTool, ARegionNeedsOnlyWhatItReads) {
    Ref<Image> big = Picture(64, 64);
    for (int edges : {0, 2}) {
        SCOPED_TRACE(edges);
        // Lanczos, then Sinc (the widest).
        Operator *a = Make({{"Angle", 40}, {"Size", 0.7}, {"FilterMethod", 8}, {"Edges", edges}}, big);
        Operator *b =
            AddTool(doc, "Transform", a, {{"Angle", -25}, {"Size", 1.6}, {"FilterMethod", 9}, {"Edges", edges}});
        SetPoint(b, "Center", 0.6, 0.52);
        const ImgRectI region(20, 25, 36, 33);
        Ref<Image> whole = Render(b);
        src->asked.clear();
        Ref<Image> part = Render(b, {.roi = region});
        ASSERT_TRUE(whole && part);
        EXPECT_EQ(part->DataWindow(), region);
        ExpectSamePixels(*part, *whole, region);
        ASSERT_EQ(src->asked.size(), 1u);
        if (edges == EdgeCanvas) {
            // A 16 x 8 region reads about 48 x 48 of the source through the two steps and the widest filter's reach.
            ASSERT_TRUE(src->asked[0]);
            EXPECT_TRUE(src->asked[0]->rect.Width() < 64 && src->asked[0]->rect.Height() < 64)
                << RectText(src->asked[0]->rect);
        } else {
            EXPECT_FALSE(src->asked[0]); // folding edges read the whole frame
        }
    }
}

TEST_F(TransformTool, EdgesFillTheFrameAndInvertUndoes) {
    pic = Picture(32, 32);
    Operator *xf = Make({{"Size", 0.5}, {"Edges", 1}, {"FilterMethod", 0}}); // Wrap: the picture repeats four times
    Ref<Image> tiled = Render(xf);
    ASSERT_TRUE(tiled);
    EXPECT_EQ(tiled->DataWindow(), ImgRectI(0, 0, 32, 32));
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 16; ++x) {
            // Nearest at half size about the middle: output pixel x's centre is on source 2x - 15, folded into 0..31.
            const FltPixel p = tiled->GetFlt(x, y);
            EXPECT_EQ(p, tiled->GetFlt(x + 16, y));
            EXPECT_EQ(p, tiled->GetFlt(x, y + 16));
            EXPECT_EQ(p, pic->GetFlt((2 * x + 17) % 32, (2 * y + 17) % 32)) << x << "," << y;
        }

    // A Transform with the same controls inverted after it gives the identity: the source comes through untouched.
    SetNumbers(xf, {{"Edges", 0}, {"Angle", 33}});
    SetPoint(xf, "Pivot", 0.3, 0.6);
    Operator *undo = AddTool(doc, "Transform", xf, {{"Size", 0.5}, {"Angle", 33}, {"InvertTransform", 1}});
    SetPoint(undo, "Pivot", 0.3, 0.6);
    const long before = TransformMatrix::ResampleCount();
    Ref<Image> back = Render(undo);
    EXPECT_EQ(back.Get(), pic.Get());
    EXPECT_EQ(TransformMatrix::ResampleCount(), before);

    // Size 0 is singular: inverting leaves it, and nothing of the picture shows.
    SetNumbers(xf, {{"Size", 0}, {"InvertTransform", 1}});
    Ref<Image> none = Render(xf);
    ASSERT_TRUE(none && none->DataWindow().IsNull());
}

TEST_F(TransformTool, ControlsShowByChoiceAndAMissingInputFailsWithOneLine) {
    Operator *xf = doc.AddTool(OvID("Transform"));
    ASSERT_NE(xf, nullptr);
    // Size and Aspect, or X Size and Y Size; the window list for Sinc and Bessel only.
    auto shown = [&](const char *id) { return xf->FindInput(id)->IsVisible(); };
    EXPECT_TRUE(shown("Size") && shown("Aspect") && !shown("XSize") && !shown("YSize") && !shown("WindowMethod"));
    SetNumber(xf, "UseSizeAndAspect", 0);
    EXPECT_TRUE(!shown("Size") && !shown("Aspect") && shown("XSize") && shown("YSize"));
    SetNumber(xf, "FilterMethod", 9);
    EXPECT_TRUE(shown("WindowMethod"));
    SetNumber(xf, "FilterMethod", 8);
    EXPECT_FALSE(shown("WindowMethod"));
    SetNumber(xf, "Aspect", 0); // never reaches 0
    EXPECT_DOUBLE_EQ(Control(xf, "Aspect"), 0.01);

    EXPECT_EQ(Render(xf), nullptr);
    const auto lines = doc.ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].text.rfind(xf->Name(), 0), 0u) << lines[0].text;
}

} // namespace
} // namespace Orvane::WarpTest
