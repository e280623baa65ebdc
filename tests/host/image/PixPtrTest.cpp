// PixPtr walks a row of any depth through FltPixel and Pixel.
#include "host/image/PixPtr.h"

#include <gtest/gtest.h>

#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::pixptrtest {
namespace {

TEST(PixPtr, WalksARowOfEveryDepthAsTheImageReadsIt) {
    const ImgRectI dw(-3, 2, 9, 5); // a window that starts left of the frame
    for (int depth = 1; depth <= 8; ++depth) {
        SCOPED_TRACE(depth);
        Ref<Image> img = ::Orvane::Test::Blank(8, 8, depth, &dw);
        ASSERT_TRUE(img->AllocScanLineData());
        PixPtr p(img.Get(), dw.x0, 3), q(img.Get(), dw.x0, 3), r(img.Get(), dw.x0, 3);
        for (int x = dw.x0; x < dw.x1; ++x, ++p) {
            const float v = (x - dw.x0) / 16.f;
            p.PutFlt({v, v / 2, v / 4, 1.f - v});
        }
        for (int x = dw.x0; x < dw.x1; ++x, ++q) {
            EXPECT_EQ(q.GetFlt(), img->GetFlt(x, 3)) << x;
            // The 16-bit view is the float view rounded to 1/65535.
            EXPECT_NEAR(q.GetPixel().A / 65535.0, img->GetFlt(x, 3).A, 0.5 / 65535 + 1e-7) << x;
        }
        r += 5; // whole pixels
        EXPECT_EQ(r.GetFlt(), img->GetFlt(dw.x0 + 5, 3));
        EXPECT_FALSE(PixPtr(img.Get(), dw.x1, 3)); // outside the data window
        EXPECT_FALSE(PixPtr(img.Get(), 0, dw.y1));
        if (depth != DepthAInt16 && depth != DepthRGBAInt16) continue;
        // Pixel writes round trip exactly; a mask stores alpha and reads it everywhere.
        PixPtr(img.Get(), 2, 3).PutPixel({1, 32768, 65535, 12345});
        const Pixel want = depth == DepthRGBAInt16 ? Pixel{1, 32768, 65535, 12345} : Pixel{12345, 12345, 12345, 12345};
        EXPECT_EQ(PixPtr(img.Get(), 2, 3).GetPixel(), want);
    }
}

} // namespace
} // namespace Orvane::pixptrtest
