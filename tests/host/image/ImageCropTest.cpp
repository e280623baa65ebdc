// ImageCrop (moved and subsampled copies, canvas beyond, depths, aborts) and the point samplers (exact at
// centres, bilinear between them, worked out here by hand).
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::imgcroptest {
namespace {
using namespace ::Orvane::Test;

TEST(ImageCrop, MovesCopiesAndSubsamplesAndSamplesAreExactAtCentresBilinearBetween) {
    const ImgRectI sw(2, 1, 14, 10), dw(-3, -2, 12, 11); // the output reaches beyond the moved source
    for (int sd : {DepthAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32})
        for (int dd : {DepthAFlt32, DepthRGBAInt8, DepthRGBAFlt32}) {
            Ref<Image> src = PatternAt(16, 12, sd, 5, &sw, {0.25f, 0.5f, 0.75f, 0.5f}), dst = Blank(10, 8, dd, &dw);
            ASSERT_TRUE(src->ImageCrop(dst.Get(), 4, -3, {}));
            EXPECT_EQ(dst->GetCanvasColor(), src->GetCanvasColor());
            EXPECT_TRUE(AllNear(
                *dst, dw, 1e-6,
                [&](int i, int j, int c) { return StoredValue(dd, Channel(src->GetFlt(i + 4, j - 3), c)); },
                dst->IsMask() ? 3 : 0))
                << sd << " -> " << dd;
        }
    // Same depth: bytes copied; steps subsample; refusals.
    Ref<Image> src = PatternAt(20, 14, DepthRGBAInt16, 5, nullptr, {0, 0, 0, 1}), dst = Blank(8, 6, DepthRGBAInt16);
    ASSERT_TRUE(src->ImageCrop(dst.Get(), 5, 3, {{WorkThreaded, 0}}));
    for (int j = 0; j < 6; ++j)
        ASSERT_EQ(std::memcmp(dst->ScanLine(j), src->PixelAddress(5, j + 3), dst->RowBytes()), 0) << j;
    // Every second column and third row, starting at (1, 2); column 23, row 17 lie beyond the source.
    Ref<Image> sub = Blank(12, 6, DepthRGBAFlt32);
    ASSERT_TRUE(src->ImageCrop(sub.Get(), 1, 2, {}, 2, 3));
    EXPECT_TRUE(AllNear(*sub, sub->DataWindow(), 0, [&](int i, int j) { return src->GetFlt(1 + 2 * i, 2 + 3 * j); }));
    EXPECT_FALSE(src->ImageCrop(sub.Get(), 0, 0, {}, 0, 1));
    EXPECT_FALSE(src->ImageCrop(nullptr, 0, 0, {}));
    EXPECT_FALSE(src->ImageCrop(src.Get(), 0, 0, {}));
    AbortedRequest aborted;
    EXPECT_FALSE(src->ImageCrop(dst.Get(), 0, 0, {{WorkRequest, &aborted.req}}));
    Ref<Image> pre = Blank(8, 6, DepthRGBAFlt32);
    pre->SetNoData(true);
    EXPECT_TRUE(src->ImageCrop(pre.Get(), 1, 1, {}) && !pre->HasScanLineData());
    // The point samplers: exact at centres, bilinear between, canvas outside.
    // Positions in 16.16 fixed point; pixel centres at (i << 16) + 32768.
    auto at = [](double v) { return static_cast<int32_t>(std::lround(v * 65536)); };
    FltPixel p;
    uint8_t b[4];
    uint16_t w[4];
    for (int depth = 1; depth <= 8; ++depth) {
        Ref<Image> img = PatternAt(5, 4, depth);
        for (int y = 0; y < 4; ++y)
            for (int x = 0; x < 5; ++x) {
                img->SamplePixelD(at(x + 0.5), at(y + 0.5), p);
                img->SamplePixelB(at(x + 0.5), at(y + 0.5), b);
                img->SamplePixelW(at(x + 0.5), at(y + 0.5), w);
                EXPECT_TRUE(p == img->GetFlt(x, y) && b[3] == NearestCode(p.A, 255) && w[0] == NearestCode(p.R, 65535))
                    << depth << ": " << x << "," << y;
            }
    }
    // A 3 x 2 float image with chosen values, canvas clear.
    const float v[2][3] = {{0.0f, 0.4f, 0.8f}, {0.2f, 1.0f, 0.6f}};
    Ref<Image> img = Filled(3, 2, DepthRGBAFlt32, [&](int x, int y) {
        return FltPixel{v[y][x], 1 - v[y][x], 0.5f, 1};
    });
    // A quarter of the way right from the centre of (0, 0) and three quarters up.
    const double want = (0.0 * 0.75 + 0.4 * 0.25) * 0.25 + (0.2 * 0.75 + 1.0 * 0.25) * 0.75;
    img->SamplePixelD(at(0.75), at(1.25), p);
    EXPECT_TRUE(std::fabs(p.R - want) <= 1e-6 && std::fabs(p.G - (1 - want)) <= 1e-6) << p.R << " " << p.G;
    img->SamplePixelD(at(2.5), at(1.0), p); // on column 2's centre line, between its rows
    EXPECT_NEAR(p.R, (0.8 + 0.6) / 2, 1e-6);
    img->SamplePixelD(at(0.0), at(0.5), p); // half a pixel beyond the left edge: halfway to the canvas
    EXPECT_NEAR(p.A, 0.5, 1e-6);
    img->SamplePixelD(-100 << 16, 40 << 16, p); // far outside: the canvas
    EXPECT_EQ(p, img->GetCanvasColor());
    // The integer forms round to nearest and clamp.
    img->SamplePixelB(at(0.75), at(1.25), b);
    img->SamplePixelW(at(0.75), at(1.25), w);
    EXPECT_TRUE(b[0] == NearestCode(want, 255) && w[0] == NearestCode(want, 65535));
    img->PutFlt(0, 0, {1.5f, -0.5f, 0.5f, 1});
    img->SamplePixelB(at(0.5), at(0.5), b);
    EXPECT_TRUE(b[0] == 255 && b[1] == 0 && b[2] == 128 && b[3] == 255);
}

} // namespace
} // namespace Orvane::imgcroptest
