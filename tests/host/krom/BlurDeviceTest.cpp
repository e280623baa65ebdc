// The blur kernels against the rows. Both sum the same weights over the same samples, but the rows run boxes as
// running sums in double and fuse multiply-adds, the kernels sum each tap in order: over ~120 taps a float moves
// by a few 1e-7 of values up to 1.5, so 1e-5; integers may round the other way at a half code, halves by a unit.
#include "host/image/BlurFilters.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/host/krom/DeviceTestSupport.h"

namespace Orvane {
namespace {
using namespace ::Orvane::Test;

/// Largest tolerated difference for a depth.
double Tolerance(int depth, float value) {
    switch ((depth - 1) % 4) {
    case 0: return 1.0 / 255 + 1e-6;
    case 1: return 1.0 / 65535 + 1e-6;
    case 2: return std::max(1e-5, std::fabs(value) / 1024.0);
    default: return 1e-5;
    }
}

/// A source of `depth` over `window` of a 57 x 41 frame with a canvas.
Ref<Image> Source(int depth, const ImgRectI &window) {
    Ref<Image> img = PatternAt(57, 41, depth, 11, &window);
    img->SetCanvasColor(FltPixel{0.2f, 0.1f, 0.6f, 0.7f});
    return img;
}

TEST(DeviceBlur, EveryFiniteKindAndDepthMatchesTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    const ImgRectI window(-3, 2, 50, 37), source(4, -10, 45, 30), out = window.Grown(12, 6);
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32}) {
        Ref<Image> src = Source(depth, window);
        for (int kind :
             {BlurBox, BlurSoften, BlurBartlett, BlurSharpen, BlurGaussian, BlurFastGaussian, BlurMultiBox}) {
            SCOPED_TRACE(testing::Message() << "depth " << depth << " kind " << kind);
            // Sizes of 9.5 and 4 pixels: the fast Gaussian runs its boxes on X.
            const TagList tags{
                {BlurFilterType, kind}, {BlurXSize, 9.5 / 57}, {BlurYSize, 4.0 / 57}, {BlurSourceWindow, &source},
                {BlurBlend, 0.75},      {BlurScale, 1.1},      {BlurDoGreen, 0},      {BlurPasses, 3}};
            Ref<Image> rows = Blank(57, 41, depth, &out), dev = Blank(57, 41, depth, &out);
            ASSERT_TRUE(src->BlurTagList(rows.Get(), tags));
            DeviceRender render(ctx);
            const int launches = ctx->LaunchCount();
            ASSERT_TRUE(src->BlurTagList(dev.Get(), render.On(tags)));
            EXPECT_EQ(ctx->LaunchCount(), launches + 2) << "both passes ran on the device";
            EXPECT_TRUE(render.task.DeviceLog().empty());
            ASSERT_TRUE(dev->IsGPUMemDirty() && dev->DownloadGPUMem());
            EXPECT_EQ(dev->GetCanvasColor(), rows->GetCanvasColor());
            for (int y = out.y0; y < out.y1; ++y)
                for (int x = out.x0; x < out.x1; ++x)
                    for (int c = 0; c < 4; ++c) {
                        const float a = Channel(dev->GetFlt(x, y), c), b = Channel(rows->GetFlt(x, y), c);
                        ASSERT_NEAR(a, b, Tolerance(depth, b)) << x << "," << y << " c" << c;
                    }
        }
    }
}

TEST(DeviceBlur, RecursiveKindsInPlaceWorkAndNoDeviceStayOnTheRowsDeviceImagesStayThere) {
    ORVANE_NEED_OPENCL(ctx);
    Ref<Image> src = Source(DepthRGBAFlt32, ImgRectI(0, 0, 57, 41));
    DeviceRender render(ctx), bare(nullptr);
    const TagList recursive{{BlurFilterType, BlurVYV5Gaussian}, {BlurXSize, 0.1}, {BlurYSize, 0.1}};
    const TagList gauss{{BlurFilterType, BlurGaussian}, {BlurXSize, 0.05}, {BlurYSize, 0.05}};
    const int launches = ctx->LaunchCount();
    // The recursive Gaussians reach the whole line: rows only, same bits.
    Ref<Image> rows = src->BlurOfImageTagList(recursive), dev = src->BlurOfImageTagList(render.On(recursive));
    ASSERT_TRUE(rows && dev);
    EXPECT_FALSE(dev->IsGPUMemDirty());
    EXPECT_TRUE(SameBits(*rows, *dev));
    // In place: the rows, since one image cannot be read and written at once.
    Ref<Image> expected = src->BlurOfImageTagList(gauss), copy = CopyOfImage(src.Get());
    ASSERT_TRUE(copy->BlurTagList(copy.Get(), render.On(gauss)));
    EXPECT_TRUE(SameBits(*copy, *expected));
    // A request whose render has no device: the rows, and nothing logged.
    Ref<Image> fallback = src->BlurOfImageTagList(bare.On(gauss));
    ASSERT_TRUE(fallback);
    EXPECT_FALSE(fallback->IsGPUMemDirty());
    EXPECT_TRUE(SameBits(*fallback, *expected));
    EXPECT_EQ(ctx->LaunchCount(), launches);
    // The source's pixels live on the device only: the kernels read them there, and match the rows' blur.
    const ImgRectI frame(0, 0, 57, 41);
    Ref<Image> made = Source(DepthRGBAFlt32, frame);
    DeviceRender onCtx(ctx);
    const TagList second{{BlurFilterType, BlurGaussian}, {BlurYSize, 5.0 / 57}};
    Ref<Image> onDevice = made->BlurOfImageTagList(onCtx.On({{BlurFilterType, BlurBox}, {BlurXSize, 2.0 / 57}}));
    ASSERT_TRUE(onDevice && onDevice->IsGPUMemDirty());
    Ref<Image> twice = onDevice->BlurOfImageTagList(onCtx.On(second));
    ASSERT_TRUE(twice && twice->IsGPUMemDirty());
    ASSERT_TRUE(twice->DownloadGPUMem() && onDevice->DownloadGPUMem());
    EXPECT_LT(MaxDiff(*twice, *onDevice->BlurOfImageTagList(second), frame), 1e-5);
}

} // namespace
} // namespace Orvane
