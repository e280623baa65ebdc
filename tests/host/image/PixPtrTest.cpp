// PixPtr walks a row of any depth through FltPixel and Pixel.
#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/image/PixPtr.h"

namespace Orvane::pixptrtest {
namespace {

TEST(PixPtr, WalksARowOfEveryDepthAndMatchesTheImagesOwnAccess) {
    for (int depth = 1; depth <= 8; ++depth) {
        SCOPED_TRACE(depth);
        const ImgRectI dw(-3, 2, 9, 5); // a window that starts left of the frame
        Ref<Image> img = NewImageTagList({{ImgWidth, 8}, {ImgHeight, 8}, {ImgDepth, depth}, {ImgDataWindow, &dw}});
        ASSERT_TRUE(img && img->AllocScanLineData());
        PixPtr p(img.Get(), dw.x0, 3);
        ASSERT_TRUE(p);
        for (int x = dw.x0; x < dw.x1; ++x, ++p) {
            const float v = static_cast<float>(x - dw.x0) / 16.f;
            p.PutFlt({v, v / 2, v / 4, 1.f - v});
        }
        PixPtr q(img.Get(), dw.x0, 3);
        for (int x = dw.x0; x < dw.x1; ++x, ++q) {
            const FltPixel viaCursor = q.GetFlt();
            EXPECT_EQ(viaCursor, img->GetFlt(x, 3)) << x;
            // The 16-bit view is the float view rounded to 1/65535.
            const Pixel px = q.GetPixel();
            EXPECT_NEAR(px.A / 65535.0, viaCursor.A, 0.5 / 65535 + 1e-7) << x;
        }
        // += moves by whole pixels.
        PixPtr r(img.Get(), dw.x0, 3);
        r += 5;
        EXPECT_EQ(r.GetFlt(), img->GetFlt(dw.x0 + 5, 3));
        // Outside the data window there is no pixel to point at.
        EXPECT_FALSE(PixPtr(img.Get(), dw.x1, 3));
        EXPECT_FALSE(PixPtr(img.Get(), 0, dw.y1));
    }
}

TEST(PixPtr, PixelWritesRoundTripExactlyOnSixteenBitDepths) {
    for (int depth : {DepthAInt16, DepthRGBAInt16}) {
        SCOPED_TRACE(depth);
        Ref<Image> img = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 1}, {ImgDepth, depth}});
        ASSERT_TRUE(img && img->AllocScanLineData());
        const Pixel written{1, 32768, 65535, 12345};
        PixPtr(img.Get(), 2, 0).PutPixel(written);
        const Pixel read = PixPtr(img.Get(), 2, 0).GetPixel();
        if (depth == DepthRGBAInt16)
            EXPECT_EQ(read, written);
        else
            EXPECT_EQ(read, (Pixel{12345, 12345, 12345, 12345})) << "a mask stores alpha and reads it everywhere";
    }
}

} // namespace
} // namespace Orvane::pixptrtest
