// The host blur on the device (the common kernels "BlurRows" and
// "BlurColumns") against its rows, on OpenCL (PoCL on machines without a GPU).
//
// Tolerance: both sum the same weights over the same samples, but the rows
// run boxes as running sums in double and let the compiler fuse
// multiply-adds, while the kernels sum each tap in order without fusing; over
// the up to ~120 taps here that moves a float result by a few 1e-7 of the
// values' size (which reach 1.5), so 1e-5; integer outputs may round the
// other way at a half code (one code), half floats by one unit in 11 bits.
#include <cmath>
#include <memory>

#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

/// Largest tolerated difference for a depth (see the head of the file).
double Tolerance(int depth, float value) {
    const PixelFormat f = FormatOfDepth(depth);
    if (f.type == ComponentType::Int8) return 1.0 / 255 + 1e-6;
    if (f.type == ComponentType::Int16) return 1.0 / 65535 + 1e-6;
    if (f.type == ComponentType::Flt16) return std::max(1e-5, std::fabs(value) / 1024.0);
    return 1e-5;
}

float Channel(const FltPixel &p, int c) { return c == 0 ? p.R : c == 1 ? p.G : c == 2 ? p.B : p.A; }

/// A source of `depth` over `window` of a 57 x 41 frame with a canvas.
Ref<Image> Source(int depth, const ImgRectI &window) {
    Ref<Image> pattern = Test::PatternImage(window.Width(), window.Height(), DepthRGBAFlt32, 11);
    const FltPixel canvas{0.2f, 0.1f, 0.6f, 0.7f};
    Ref<Image> img = NewImageTagList(
        {{ImgWidth, 57}, {ImgHeight, 41}, {ImgDepth, depth}, {ImgDataWindow, &window}, {ImgCanvasColor, &canvas}});
    EXPECT_TRUE(img->AllocScanLineData());
    for (int y = window.y0; y < window.y1; ++y)
        for (int x = window.x0; x < window.x1; ++x) img->PutFlt(x, y, pattern->GetFlt(x - window.x0, y - window.y0));
    return img;
}

TEST(DeviceBlur, EveryFiniteKindAndDepthMatchesTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    const ImgRectI window(-3, 2, 50, 37), source(4, -10, 45, 30);
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32}) {
        Ref<Image> src = Source(depth, window);
        for (int kind :
             {BlurBox, BlurSoften, BlurBartlett, BlurSharpen, BlurGaussian, BlurFastGaussian, BlurMultiBox}) {
            SCOPED_TRACE(testing::Message() << "depth " << depth << " kind " << kind);
            // Sizes of 9.5 and 4 pixels: the fast Gaussian runs its boxes on X.
            TagList tags{
                {BlurFilterType, kind}, {BlurXSize, 9.5 / 57}, {BlurYSize, 4.0 / 57}, {BlurSourceWindow, &source},
                {BlurBlend, 0.75},      {BlurScale, 1.1},      {BlurDoGreen, 0},      {BlurPasses, 3}};
            const ImgRectI out = window.Grown(12, 6);
            Ref<Image> rows = NewImageTagList({{ImgLikeImage, src.Get()}, {ImgDataWindow, &out}});
            Ref<Image> dev = NewImageTagList({{ImgLikeImage, src.Get()}, {ImgDataWindow, &out}});
            ASSERT_TRUE(src->BlurTagList(rows.Get(), tags));
            RenderTask task;
            task.SetDevice(ctx);
            Request req(nullptr, nullptr, 0.0, 0, &task);
            tags.Set({WorkUseGPU, 1});
            tags.Set({WorkRequest, &req});
            const int launches = ctx->LaunchCount();
            ASSERT_TRUE(src->BlurTagList(dev.Get(), tags));
            EXPECT_EQ(ctx->LaunchCount(), launches + 2) << "both passes ran on the device";
            EXPECT_TRUE(dev->IsGPUMemDirty());
            EXPECT_TRUE(task.DeviceLog().empty());
            ASSERT_TRUE(dev->DownloadGPUMem());
            EXPECT_EQ(dev->GetCanvasColor(), rows->GetCanvasColor());
            for (int y = out.y0; y < out.y1; ++y)
                for (int x = out.x0; x < out.x1; ++x) {
                    const FltPixel a = dev->GetFlt(x, y), b = rows->GetFlt(x, y);
                    for (int c = 0; c < 4; ++c)
                        ASSERT_NEAR(Channel(a, c), Channel(b, c), Tolerance(depth, Channel(b, c)))
                            << x << "," << y << " c" << c;
                }
        }
    }
}

TEST(DeviceBlur, RecursiveKindsInPlaceWorkAndFailuresStayOnTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    const ImgRectI window(0, 0, 57, 41);
    Ref<Image> src = Source(DepthRGBAFlt32, window);
    RenderTask task;
    task.SetDevice(ctx);
    Request req(nullptr, nullptr, 0.0, 0, &task);
    auto same = [&](const Image &a, const Image &b) {
        for (int y = window.y0; y < window.y1; ++y)
            for (int x = window.x0; x < window.x1; ++x)
                if (!(a.GetFlt(x, y) == b.GetFlt(x, y))) return false;
        return true;
    };
    // The recursive Gaussians reach the whole line: rows only, same bits.
    const TagList recursive{{BlurFilterType, BlurVYV5Gaussian}, {BlurXSize, 0.1}, {BlurYSize, 0.1}};
    TagList onDevice = recursive;
    onDevice.Set({WorkUseGPU, 1});
    onDevice.Set({WorkRequest, &req});
    Ref<Image> rows = src->BlurOfImageTagList(recursive);
    const int launches = ctx->LaunchCount();
    Ref<Image> dev = src->BlurOfImageTagList(onDevice);
    ASSERT_TRUE(rows && dev);
    EXPECT_EQ(ctx->LaunchCount(), launches);
    EXPECT_FALSE(dev->IsGPUMemDirty());
    EXPECT_TRUE(same(*rows, *dev));

    // In place: the rows, since one image cannot be read and written at once.
    const TagList gauss{{BlurFilterType, BlurGaussian}, {BlurXSize, 0.05}, {BlurYSize, 0.05}};
    TagList gaussDevice = gauss;
    gaussDevice.Set({WorkUseGPU, 1});
    gaussDevice.Set({WorkRequest, &req});
    Ref<Image> expected = src->BlurOfImageTagList(gauss);
    Ref<Image> copy = CopyOfImage(src.Get());
    ASSERT_TRUE(copy->BlurTagList(copy.Get(), gaussDevice));
    EXPECT_EQ(ctx->LaunchCount(), launches);
    EXPECT_TRUE(same(*copy, *expected));

    // A request whose render has no device: the rows, and nothing logged.
    RenderTask bare;
    Request bareReq(nullptr, nullptr, 0.0, 0, &bare);
    TagList noDevice = gauss;
    noDevice.Set({WorkUseGPU, 1});
    noDevice.Set({WorkRequest, &bareReq});
    Ref<Image> fallback = src->BlurOfImageTagList(noDevice);
    ASSERT_TRUE(fallback);
    EXPECT_FALSE(fallback->IsGPUMemDirty());
    EXPECT_TRUE(same(*fallback, *expected));
}

TEST(DeviceBlur, AnImageMadeOnTheDeviceIsBlurredThere) {
    // The source's pixels live on the device only (stale main memory): the
    // kernels read them there, and the result matches the rows' blur of the
    // downloaded source.
    ORVANE_NEED_OPENCL(ctx);
    const ImgRectI window(0, 0, 57, 41);
    Ref<Image> src = Source(DepthRGBAFlt32, window);
    RenderTask task;
    task.SetDevice(ctx);
    Request req(nullptr, nullptr, 0.0, 0, &task);
    const TagList first{{BlurFilterType, BlurBox}, {BlurXSize, 2.0 / 57}, {WorkUseGPU, 1}, {WorkRequest, &req}};
    Ref<Image> onDevice = src->BlurOfImageTagList(first);
    ASSERT_TRUE(onDevice && onDevice->IsGPUMemDirty());
    const TagList second{{BlurFilterType, BlurGaussian}, {BlurYSize, 5.0 / 57}, {WorkUseGPU, 1}, {WorkRequest, &req}};
    Ref<Image> twice = onDevice->BlurOfImageTagList(second);
    ASSERT_TRUE(twice && twice->IsGPUMemDirty());
    ASSERT_TRUE(twice->DownloadGPUMem());
    ASSERT_TRUE(onDevice->DownloadGPUMem());
    Ref<Image> rows = onDevice->BlurOfImageTagList({{BlurFilterType, BlurGaussian}, {BlurYSize, 5.0 / 57}});
    for (int y = window.y0; y < window.y1; ++y)
        for (int x = window.x0; x < window.x1; ++x) ASSERT_NEAR(twice->GetFlt(x, y).B, rows->GetFlt(x, y).B, 1e-5);
}

} // namespace
} // namespace Orvane
