// The "Merge" kernel against the merge's rows: every mode the kernel has,
// every Normal operator, blend, additive, alpha gain, burn in and channels,
// windows that overlap unevenly, a placed foreground, all depths. The kernel
// does the rows' float arithmetic in their order, so float results are the
// rows' bits. Integer results agree to one code: the device stores v x 255
// (or 65535) + 1/2 rounded in float, the rows in double, which parts the two
// on values that fall on a half code (an alpha gain of 0.7 over opaque
// pixels gives 0.7 x 65535 = 45874.5, for one).
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/MergeModes.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/krom/DeviceContext.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::mergedevicetest {
namespace {

struct Case {
    int mode, op;
    double blend, additive, gain, burn;
    bool red, alpha;
};

TEST(DeviceMerge, TheKernelGivesTheRowsBits) {
    ORVANE_NEED_OPENCL(ctx);
    const Case cases[] = {
        {MrgNormal, MrgOver, 1, 0, 1, 0, true, true},      {MrgNormal, MrgIn, 1, 0, 1, 0, true, true},
        {MrgNormal, MrgHeldOut, 0.6, 0, 1, 0, true, true}, {MrgNormal, MrgAtop, 1, 0.4, 0.5, 0.2, true, true},
        {MrgNormal, MrgXOr, 1, 0, 1, 0, false, true},      {MrgScreen, 0, 1, 0, 1, 0, true, true},
        {MrgMultiply, 0, 0.3, 0, 1, 0, true, false},       {MrgDarken, 0, 1, 0, 1, 0, true, true},
        {MrgLighten, 0, 1, 1, 1, 0, true, true},           {MrgDifference, 0, 1, 0, 0.7, 0, true, true},
        {MrgExclusion, 0, 1, 0, 1, 0.5, true, true},       {MrgAdd, 0, 1, 0, 1, 0, true, true},
        {MrgSubtract, 0, 0.8, 0, 1, 0, true, true},
    };
    Ref<Image> fgSrc = Orvane::Test::PatternImage(29, 17, DepthRGBAFlt32, 3);
    Ref<Image> bgSrc = Orvane::Test::PatternImage(37, 21, DepthRGBAFlt32, 4);
    fgSrc->SetCanvasColor(FltPixel{0.f, 0.f, 0.f, 0.f});
    bgSrc->SetCanvasColor(FltPixel{0.1f, 0.2f, 0.3f, 0.5f});
    const ImgRectI fw(-3, 2, 26, 19), bw(0, 0, 37, 21);
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32}) {
        // The inputs at the depth, with windows that meet partly.
        Ref<Image> fg = NewImageTagList({{ImgLikeImage, fgSrc.Get()}, {ImgDepth, depth}, {ImgDataWindow, &fw}});
        Ref<Image> bg = NewImageTagList({{ImgLikeImage, bgSrc.Get()}, {ImgDepth, depth}, {ImgDataWindow, &bw}});
        fg->ImageCopy(fgSrc.Get());
        bg->ImageCopy(bgSrc.Get());
        fg->SetCanvasColor(fgSrc->GetCanvasColor());
        bg->SetCanvasColor(bgSrc->GetCanvasColor());
        for (const Case &c : cases) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " mode " + std::to_string(c.mode) + " op " +
                         std::to_string(c.op));
            TagList tags{{MrgApplyMode, c.mode}, {MrgOperator, c.op}, {MrgBlend, c.blend}, {MrgAdditive, c.additive},
                         {MrgAlphaGain, c.gain}, {MrgBurnIn, c.burn}, {MrgDoRed, c.red},   {MrgDoAlpha, c.alpha},
                         {MrgFgOffsetX, 5},      {MrgFgOffsetY, -4}};
            const MergeSettings s = MergeSettings::FromTags(tags);
            ASSERT_TRUE(MergeKernelSupports(s));
            ImgRectI placed = fg->DataWindow();
            placed.Offset(5, -4);
            const ImgRectI out = MergeDataWindow(s, placed, fg->GetCanvasColor(), bw, bg->GetCanvasColor());
            Ref<Image> cpu = NewImageTagList({{ImgLikeImage, bg.Get()}, {ImgDataWindow, &out}});
            Ref<Image> dev = NewImageTagList({{ImgLikeImage, bg.Get()}, {ImgDataWindow, &out}});
            ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), cpu.Get(), tags));
            RenderTask task;
            task.SetDevice(ctx);
            Request req(nullptr, nullptr, 0.0, 0, &task);
            TagList devTags = tags;
            devTags.Set({WorkUseGPU, 1});
            devTags.Set({WorkRequest, &req});
            const int launches = ctx->LaunchCount();
            ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dev.Get(), devTags));
            EXPECT_EQ(ctx->LaunchCount(), launches + 1) << "the device ran it";
            EXPECT_TRUE(dev->IsGPUMemDirty());
            ASSERT_TRUE(dev->DownloadGPUMem());
            EXPECT_EQ(dev->GetCanvasColor(), cpu->GetCanvasColor());
            ASSERT_EQ(dev->DataWindow(), cpu->DataWindow());
            if (FormatOfDepth(depth).isFloat) {
                EXPECT_EQ(std::memcmp(dev->ScanLine(out.y0), cpu->ScanLine(out.y0), cpu->RowBytes() * out.Height()), 0);
                continue;
            }
            for (int y = out.y0; y < out.y1; ++y)
                for (int x = out.x0; x < out.x1; ++x) {
                    Pixel a, b;
                    LoadPixel(depth, dev->PixelAddress(x, y), 1, &a);
                    LoadPixel(depth, cpu->PixelAddress(x, y), 1, &b);
                    const int step = depth == DepthRGBAInt8 ? 257 : 1;
                    const int d =
                        std::max({std::abs(a.R - b.R), std::abs(a.G - b.G), std::abs(a.B - b.B), std::abs(a.A - b.A)});
                    ASSERT_LE(d, step) << x << "," << y;
                }
        }
    }
}

TEST(DeviceMerge, ModesWithoutAKernelRunTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    Ref<Image> fg = Orvane::Test::PatternImage(8, 6, DepthRGBAFlt32, 5);
    Ref<Image> bg = Orvane::Test::PatternImage(8, 6, DepthRGBAFlt32, 6);
    for (int mode : {MrgDissolve, MrgOverlay, MrgSoftLight, MrgColorDodge, MrgHue, MrgLuminosity}) {
        const TagList tags{{MrgApplyMode, mode}};
        EXPECT_FALSE(MergeKernelSupports(MergeSettings::FromTags(tags))) << mode;
        Ref<Image> cpu = NewImageTagList({{ImgLikeImage, bg.Get()}});
        Ref<Image> dev = NewImageTagList({{ImgLikeImage, bg.Get()}});
        ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), cpu.Get(), tags));
        RenderTask task;
        task.SetDevice(ctx);
        Request req(nullptr, nullptr, 0.0, 0, &task);
        TagList devTags = tags;
        devTags.Set({WorkUseGPU, 1});
        devTags.Set({WorkRequest, &req});
        const int launches = ctx->LaunchCount();
        ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dev.Get(), devTags));
        EXPECT_EQ(ctx->LaunchCount(), launches) << mode;
        EXPECT_FALSE(dev->IsGPUMemDirty());
        EXPECT_EQ(std::memcmp(dev->ScanLine(0), cpu->ScanLine(0), cpu->RowBytes() * 6), 0) << mode;
    }
    // A depth merge and auxiliary planes stay on the rows too.
    MergeSettings z;
    z.zMerge = true;
    EXPECT_FALSE(MergeKernelSupports(z));
}

} // namespace
} // namespace Orvane::mergedevicetest
