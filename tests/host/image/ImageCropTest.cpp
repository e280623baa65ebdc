// Image::ImageCrop (moved and subsampled copies, canvas beyond the source,
// depth conversion, aborts) and the point samplers SamplePixelB/W/D
// (exact at pixel centres, bilinear between them, worked out here by hand).
#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <cstring>

#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "tests/support/TestSupport.h"

namespace Orvane::imgcroptest {
namespace {
namespace ts = ::Orvane::Test;

Ref<Image> Blank(int w, int h, int depth, const ImgRectI *dw = nullptr) {
    TagList tags{{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}};
    if (dw) tags.Set({ImgDataWindow, dw});
    return NewImageTagList(tags);
}

Ref<Image> Pattern(int w, int h, int depth, const ImgRectI *dw = nullptr, unsigned seed = 5) {
    Ref<Image> f = ts::PatternImage(w, h, DepthRGBAFlt32, seed);
    Ref<Image> img = Blank(w, h, depth, dw);
    img->AllocScanLineData();
    img->ImageCopy(f.Get());
    return img;
}

/// A component stored at `depth` from float v, read back.
float Stored(int depth, float v) {
    FltPixel p{v, v, v, v}, back;
    uint8_t bytes[16];
    StoreFlt(depth, &p, 1, bytes);
    LoadFlt(depth, bytes, 1, &back);
    return back.A;
}

TEST(ImageCrop, MovesThePictureAndFillsTheRestWithCanvas) {
    const ImgRectI sw(2, 1, 14, 10);
    for (int sd : {DepthAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32})
        for (int dd : {DepthAFlt32, DepthRGBAInt8, DepthRGBAFlt32}) {
            SCOPED_TRACE(testing::Message() << sd << " -> " << dd);
            Ref<Image> src = Pattern(16, 12, sd, &sw);
            const FltPixel canvas{0.25f, 0.5f, 0.75f, 0.5f};
            src->SetCanvasColor(canvas);
            // The output window reaches beyond the moved source on every side.
            const ImgRectI dw(-3, -2, 12, 11);
            Ref<Image> dst = Blank(10, 8, dd, &dw);
            ASSERT_TRUE(src->ImageCrop(dst.Get(), 4, -3, {}));
            EXPECT_EQ(dst->GetCanvasColor(), canvas);
            for (int j = dw.y0; j < dw.y1; ++j)
                for (int i = dw.x0; i < dw.x1; ++i) {
                    const FltPixel want = src->GetFlt(i + 4, j - 3), got = dst->GetFlt(i, j);
                    ASSERT_NEAR(got.A, Stored(dd, want.A), 1e-6) << i << "," << j;
                    if (!dst->IsMask()) {
                        ASSERT_NEAR(got.R, Stored(dd, want.R), 1e-6) << i << "," << j;
                    }
                }
        }
}

TEST(ImageCrop, SameDepthCopiesBytesAndStepsSubsample) {
    Ref<Image> src = Pattern(20, 14, DepthRGBAInt16);
    src->SetCanvasColor(FltPixel{0, 0, 0, 1});
    Ref<Image> dst = Blank(8, 6, DepthRGBAInt16);
    ASSERT_TRUE(src->ImageCrop(dst.Get(), 5, 3, {{WorkThreaded, 0}}));
    for (int j = 0; j < 6; ++j)
        ASSERT_EQ(std::memcmp(dst->ScanLine(j), src->PixelAddress(5, j + 3), dst->RowBytes()), 0) << j;
    // Every second column and third row, starting at (1, 2).
    Ref<Image> sub = Blank(12, 6, DepthRGBAFlt32);
    ASSERT_TRUE(src->ImageCrop(sub.Get(), 1, 2, {}, 2, 3));
    for (int j = 0; j < 6; ++j)
        for (int i = 0; i < 12; ++i) ASSERT_EQ(sub->GetFlt(i, j), src->GetFlt(1 + 2 * i, 2 + 3 * j)) << i << "," << j;
    EXPECT_EQ(sub->GetFlt(11, 5), src->GetCanvasColor()); // column 23, row 17: beyond the source

    EXPECT_FALSE(src->ImageCrop(sub.Get(), 0, 0, {}, 0, 1));
    EXPECT_FALSE(src->ImageCrop(nullptr, 0, 0, {}));
    EXPECT_FALSE(src->ImageCrop(src.Get(), 0, 0, {}));
    RenderTask task;
    task.Abort();
    Request req(nullptr, nullptr, 0.0, 0, &task);
    EXPECT_FALSE(src->ImageCrop(dst.Get(), 0, 0, {{WorkRequest, &req}}));
    Ref<Image> pre = Blank(8, 6, DepthRGBAFlt32);
    pre->SetNoData(true);
    EXPECT_TRUE(src->ImageCrop(pre.Get(), 1, 1, {}));
    EXPECT_FALSE(pre->HasScanLineData());
}

TEST(SamplePixel, ExactAtCentresBilinearBetweenCanvasOutside) {
    // A 3 x 2 float image with chosen values.
    Ref<Image> img = Blank(3, 2, DepthRGBAFlt32);
    img->AllocScanLineData();
    const float v[2][3] = {{0.0f, 0.4f, 0.8f}, {0.2f, 1.0f, 0.6f}};
    for (int y = 0; y < 2; ++y)
        for (int x = 0; x < 3; ++x) img->PutFlt(x, y, {v[y][x], 1 - v[y][x], 0.5f, 1});
    img->SetCanvasColor(FltPixel{0, 0, 0, 0});
    auto at = [](double x, double y, int32_t &fx, int32_t &fy) {
        fx = static_cast<int32_t>(std::lround(x * 65536)), fy = static_cast<int32_t>(std::lround(y * 65536));
    };
    int32_t fx, fy;
    FltPixel p;
    for (int y = 0; y < 2; ++y)
        for (int x = 0; x < 3; ++x) { // centres: (i << 16) + 32768
            img->SamplePixelD((x << 16) + 32768, (y << 16) + 32768, p);
            EXPECT_EQ(p, img->GetFlt(x, y));
        }
    // Between the centres of (0,0), (1,0), (0,1), (1,1): a quarter of the way
    // right and three quarters up: 0.75*0.25*... by hand.
    at(0.5 + 0.25, 0.5 + 0.75, fx, fy);
    img->SamplePixelD(fx, fy, p);
    const double want = (0.0 * 0.75 + 0.4 * 0.25) * 0.25 + (0.2 * 0.75 + 1.0 * 0.25) * 0.75;
    EXPECT_NEAR(p.R, want, 1e-6);
    EXPECT_NEAR(p.G, 1 - want, 1e-6);
    // On the vertical centre line of column 2 between its rows: only that column.
    at(2.5, 1.0, fx, fy);
    img->SamplePixelD(fx, fy, p);
    EXPECT_NEAR(p.R, (0.8 + 0.6) / 2, 1e-6);
    // Half a pixel beyond the left edge: halfway to the canvas.
    at(0.0, 0.5, fx, fy);
    img->SamplePixelD(fx, fy, p);
    EXPECT_NEAR(p.R, 0.0 / 2, 1e-6);
    EXPECT_NEAR(p.A, 0.5, 1e-6);
    // Far outside: the canvas.
    img->SamplePixelD(-100 << 16, 40 << 16, p);
    EXPECT_EQ(p, img->GetCanvasColor());

    // The integer forms round to nearest and clamp.
    uint8_t b[4];
    uint16_t w[4];
    at(0.75, 1.25, fx, fy);
    img->SamplePixelB(fx, fy, b);
    img->SamplePixelW(fx, fy, w);
    EXPECT_EQ(b[0], static_cast<uint8_t>(std::lround(want * 255)));
    EXPECT_EQ(w[0], static_cast<uint16_t>(std::lround(want * 65535)));
    EXPECT_EQ(b[3], 255);
    Ref<Image> hot = Blank(1, 1, DepthRGBAFlt32);
    hot->AllocScanLineData();
    hot->PutFlt(0, 0, {1.5f, -0.5f, 0.5f, 1});
    hot->SamplePixelB(32768, 32768, b);
    EXPECT_EQ(b[0], 255);
    EXPECT_EQ(b[1], 0);
    EXPECT_EQ(b[2], 128);
}

TEST(SamplePixel, IntegerAndMaskImagesAtCentres) {
    for (int depth = 1; depth <= 8; ++depth) {
        SCOPED_TRACE(depth);
        Ref<Image> img = Pattern(5, 4, depth);
        for (int y = 0; y < 4; ++y)
            for (int x = 0; x < 5; ++x) {
                FltPixel p;
                img->SamplePixelD((x << 16) + 32768, (y << 16) + 32768, p);
                EXPECT_EQ(p, img->GetFlt(x, y));
                if (depth == DepthRGBAInt8 || depth == DepthAInt8) {
                    uint8_t b[4];
                    img->SamplePixelB((x << 16) + 32768, (y << 16) + 32768, b);
                    EXPECT_EQ(b[3], img->ScanLine(y)[(x + 1) * (depth == DepthAInt8 ? 1 : 4) - 1]);
                }
                if (depth == DepthRGBAInt16) {
                    uint16_t w[4];
                    img->SamplePixelW((x << 16) + 32768, (y << 16) + 32768, w);
                    EXPECT_EQ(w[0], img->Row<uint16_t>(y)[4 * x]);
                }
            }
    }
}

} // namespace
} // namespace Orvane::imgcroptest
