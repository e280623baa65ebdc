// The shared sizing vocabulary on its own: window arithmetic against hand-worked corners, the aspect keeping sizes, the
// attributes written back, and the coefficient tables kept while their key holds.
#include <gtest/gtest.h>

#include "operators/warp/SizingCommon.h"
#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest::Common {
namespace {

TEST(SizingWindows, CornersRoundOutwardEndlessSidesStayAndPlacingInverts) {
    // 3 x 0.5 = 1.5 down to 1, -5 x 1.5 = -7.5 down to -8, 17 x 0.5 = 8.5 up to 9, 9 x 1.5 = 13.5 up to 14.
    EXPECT_EQ(ScaleWindow(ImgRectI(3, -5, 17, 9), 0.5f, 1.5f), ImgRectI(1, -8, 9, 14));
    // 21 x (1/7 in single precision) is 3.0000002: up to 4 (a double product would give exactly 3).
    EXPECT_EQ(ScaleWindow(ImgRectI(0, 0, 21, 21), 1.f / 7.f, 1.f / 7.f), ImgRectI(0, 0, 4, 4));
    // A reach grows each side before scaling: (2 - 1.5) x 2 = 1, (10 + 1.5) x 2 = 23.
    EXPECT_EQ(ScaleWindow(ImgRectI(2, 2, 10, 10), 2.f, 2.f, 1.5f, 0.f), ImgRectI(1, 4, 23, 20));
    EXPECT_EQ(ScaleWindow(ImgRectI(-E, 4, E, E), 0.25f, 3.f), ImgRectI(-E, 12, E, E));
    EXPECT_EQ(ScaleWindow(ImgRectI(-E, -E, 7, E), 0.5f, 0.5f, 2.f, 2.f), ImgRectI(-E, -E, 5, E));
    EXPECT_EQ(PlaceWindow(ImgRectI(-E, 0, 10, E), 0.5, 2.0, 3.25, -1.0), ImgRectI(-E, -1, 9, E));
    EXPECT_EQ(SourceRegion(ImgRectI(-E, 3, E, 8), 2.0, 2.0, 1.0, 1.0), ImgRectI(-E, 5, E, 17));
    // Placing (x0 x 0.5 + 3.25): 4 -> 5.25 down to 5, 10 -> 8.25 up to 9; back: (5 - 3.25) x 2 - 1 = 2.5
    // down to 2, (9 - 3.25) x 2 + 1 = 12.5 up to 13.
    EXPECT_EQ(PlaceWindow(ImgRectI(4, 4, 10, 10), 0.5, 0.5, 3.25, 0.0), ImgRectI(5, 2, 9, 5));
    EXPECT_EQ(SourceRegion(ImgRectI(5, 2, 9, 5), 2.0, 2.0, 1.0, 0.0, 3.25, 0.0), ImgRectI(2, 4, 13, 10));
    // Whatever the placement, the source region of a placed window holds the window.
    const ImgRectI w(-13, 5, 40, 77);
    for (double s : {0.3, 0.5, 1.0, 1.7, 4.0})
        for (double o : {-2.6, 0.0, 0.5, 7.3})
            EXPECT_TRUE(SourceRegion(PlaceWindow(w, s, s, o, o), 1 / s, 1 / s, 0, 0, o, o).Contains(w))
                << s << " " << o;
}

TEST(SizingFormat, AspectKeepingSizesListChoicesAndAttributes) {
    SourceFormat hd;
    hd.width = hd.fullWidth = 1920;
    hd.height = hd.fullHeight = 1080;
    // At a target pixel aspect of 0.9 : 1 each pixel is narrower, so fewer
    // lines: 1280 x 0.9 / (16 / 9) = 648; 1000 x 9 / 16 = 562.5 rounds up.
    EXPECT_EQ(HeightKeepingAspect(hd, 1280, 0.9, 1.0), 648);
    EXPECT_EQ(HeightKeepingAspect(hd, 1000, 1.0, 1.0), 563);
    EXPECT_EQ(WidthKeepingAspect(hd, 720, 1.0, 1.0), 1280);
    // A zero aspect gives no finite size: the result stays within 1..MaxFrameSize() rather than wrapping.
    EXPECT_EQ(WidthKeepingAspect(hd, 720, 0.0, 1.0), static_cast<int>(MaxFrameSize()));
    EXPECT_EQ(HeightKeepingAspect(hd, 1280, 0.0, 1.0), 1);
    // A list choice is its rounded number, kept within the list.
    EXPECT_EQ(FilterValue(4.6), RszCatmullRom);
    EXPECT_EQ(FilterValue(14), RszBessel);
    EXPECT_EQ(WindowValue(3), RszWindowKaiser);

    // Attributes follow the result and keep the proxy ratio.
    const TagList field{{ImgWidth, 960},      {ImgHeight, 270},     {ImgXScale, 2.0}, {ImgYScale, 4.0},
                        {ImgFullWidth, 1920}, {ImgFullHeight, 540}, {ImgField, 0},    {ImgFieldOffset, 0.5 / 270},
                        {ImgFullXScale, 1.0}, {ImgFullYScale, 2.0}};
    Ref<Image> proxy = NewImageTagList(field);
    Ref<Image> out = NewImageTagList({{ImgLikeImage, proxy.Get()}, {ImgWidth, 640}, {ImgHeight, 180}});
    WriteFormatAttrs(*out, ReadSourceFormat(*proxy), 1280, 720, std::pair{0.9, 1.1});
    EXPECT_TRUE(out->GetAttrL(ImgFullWidth) == 1280 &&
                out->GetAttrL(ImgFullHeight) == 360); // a field holds half the frame's lines
    EXPECT_DOUBLE_EQ(out->GetAttrD(ImgFieldOffset), 0.5 / 180);
    // The new aspect (Y doubled for a field) in the attributes; the scale keeps the proxy's factor 2 over them.
    EXPECT_DOUBLE_EQ(out->GetAttrD(ImgFullXScale), 0.9);
    EXPECT_DOUBLE_EQ(out->GetAttrD(ImgFullYScale), 2.2);
    EXPECT_DOUBLE_EQ(out->XScale(), 1.8);
    EXPECT_DOUBLE_EQ(out->YScale(), 4.4);
    // Without attributes on the source none is added; the aspect is set as given, never below 1e-5.
    Ref<Image> plain = NewImageTagList({{ImgWidth, 8}, {ImgHeight, 8}});
    Ref<Image> out2 = NewImageTagList({{ImgLikeImage, plain.Get()}});
    WriteFormatAttrs(*out2, ReadSourceFormat(*plain), 8, 8, std::pair{-3.0, 2.0});
    EXPECT_TRUE(out2->Attrs().Empty());
    EXPECT_DOUBLE_EQ(out2->XScale(), 1e-5);
    EXPECT_DOUBLE_EQ(out2->YScale(), 2.0);
}

TEST(SizingTables, KeptWhileTheKeyHoldsAndRebuiltOnAnyChange) {
    Ref<Image> src = PatternImage(40, 30);
    const ImgRectI window(0, 0, 20, 15);
    Ref<Image> dst = NewImageTagList({{ImgLikeImage, src.Get()}, {ImgWidth, 20}, {ImgHeight, 15}});
    const TagList tags{{ResizeFilter, RszCatmullRom}, {ResizeWindow, RszWindowHanning}};
    ResizeKey key;
    key.srcFrame = key.srcWindow = src->Frame();
    key.dstFrame = key.dstWindow = window;
    key.filter = RszCatmullRom, key.window = RszWindowHanning;
    ResizeTables tables;
    // A second frame with the same key: the very same tables, resampling as fresh ones.
    Ref<Image> fresh = DirectResize(*src, 20, 15, window, tags);
    void *x = nullptr, *y = nullptr;
    for (int frame = 0; frame < 2; ++frame) {
        Ref<Image> out = NewImageTagList({{ImgLikeImage, dst.Get()}});
        ASSERT_TRUE(ResizeInto(*src, out.Get(), tables, key, tags));
        EXPECT_EQ(tables.Builds(), 1);
        EXPECT_TRUE(tables.XTable() && tables.YTable());
        EXPECT_TRUE(frame == 0 || (tables.XTable() == x && tables.YTable() == y));
        x = tables.XTable(), y = tables.YTable();
        ExpectSamePixels(*out, *fresh, window);
    }
    // A change of a window, a list choice or a placement makes new tables, and so does going back.
    long builds = tables.Builds();
    for (auto change : {+[](ResizeKey &k) { k.srcWindow.y0 -= 2; }, +[](ResizeKey &k) { k.filter = RszLanczos; },
                        +[](ResizeKey &k) { k.yOffset = -2.0; }}) {
        ResizeKey k = key;
        change(k);
        ASSERT_TRUE(tables.Prepare(*src, dst.Get(), k, tags));
        EXPECT_EQ(tables.Builds(), ++builds);
        ASSERT_TRUE(tables.Prepare(*src, dst.Get(), key, tags));
        EXPECT_EQ(tables.Builds(), ++builds) << "going back";
    }
    tables.Free();
    EXPECT_FALSE(tables.XTable() || tables.YTable());
    ASSERT_TRUE(tables.Prepare(*src, dst.Get(), key, tags));
    EXPECT_EQ(tables.Builds(), builds + 1); // freed tables are not reused
}

} // namespace
} // namespace Orvane::WarpTest::Common
