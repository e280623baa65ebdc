// The merge kernel against the rows. It does the rows' float arithmetic in their order: float results are the
// rows' bits; integers agree to one code, as the device rounds v x 65535 + 1/2 in float (0.7 x 65535 = 45874.5).
#include "host/image/MergeModes.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/host/krom/DeviceTestSupport.h"

namespace Orvane::mergedevicetest {
namespace {
using namespace ::Orvane::Test;

TEST(DeviceMerge, TheKernelGivesTheRowsBitsAndModesWithoutOneRunTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    const std::tuple<int, int, double, double, double, double, bool, bool> cases[] = {
        {MrgNormal, MrgOver, 1, 0, 1, 0, true, true},      {MrgNormal, MrgIn, 1, 0, 1, 0, true, true},
        {MrgNormal, MrgHeldOut, 0.6, 0, 1, 0, true, true}, {MrgNormal, MrgAtop, 1, 0.4, 0.5, 0.2, true, true},
        {MrgNormal, MrgXOr, 1, 0, 1, 0, false, true},      {MrgScreen, 0, 1, 0, 1, 0, true, true},
        {MrgMultiply, 0, 0.3, 0, 1, 0, true, false},       {MrgDarken, 0, 1, 0, 1, 0, true, true},
        {MrgLighten, 0, 1, 1, 1, 0, true, true},           {MrgDifference, 0, 1, 0, 0.7, 0, true, true},
        {MrgExclusion, 0, 1, 0, 1, 0.5, true, true},       {MrgAdd, 0, 1, 0, 1, 0, true, true},
        {MrgSubtract, 0, 0.8, 0, 1, 0, true, true},
    };
    const ImgRectI fw(-3, 2, 26, 19), bw(0, 0, 37, 21); // windows that meet partly
    for (int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32}) {
        Ref<Image> fg = PatternAt(29, 17, depth, 3, &fw), bg = PatternAt(37, 21, depth, 4, &bw);
        bg->SetCanvasColor(FltPixel{0.1f, 0.2f, 0.3f, 0.5f});
        for (const auto &[mode, op, blend, additive, gain, burn, red, alpha] : cases) {
            SCOPED_TRACE("depth " + std::to_string(depth) + " mode " + std::to_string(mode) + " op " +
                         std::to_string(op));
            const TagList tags{{MrgApplyMode, mode}, {MrgOperator, op}, {MrgBlend, blend}, {MrgAdditive, additive},
                               {MrgAlphaGain, gain}, {MrgBurnIn, burn}, {MrgDoRed, red},   {MrgDoAlpha, alpha},
                               {MrgFgOffsetX, 5},    {MrgFgOffsetY, -4}};
            const MergeSettings s = MergeSettings::FromTags(tags);
            ASSERT_TRUE(MergeKernelSupports(s));
            ImgRectI placed = fw;
            placed.Offset(5, -4);
            const ImgRectI out = MergeDataWindow(s, placed, fg->GetCanvasColor(), bw, bg->GetCanvasColor());
            Ref<Image> cpu = Blank(37, 21, depth, &out), dev = Blank(37, 21, depth, &out);
            ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), cpu.Get(), tags));
            DeviceRender render(ctx);
            const int launches = ctx->LaunchCount();
            ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dev.Get(), render.On(tags)));
            EXPECT_EQ(ctx->LaunchCount(), launches + 1) << "the device ran it";
            ASSERT_TRUE(dev->IsGPUMemDirty() && dev->DownloadGPUMem());
            EXPECT_EQ(dev->GetCanvasColor(), cpu->GetCanvasColor());
            if (FormatOfDepth(depth).isFloat)
                EXPECT_TRUE(SameBits(*dev, *cpu));
            else
                EXPECT_LE(MaxDiff(*dev, *cpu, out), (depth == DepthRGBAInt8 ? 1 / 255.0 : 1 / 65535.0) + 1e-7);
        }
    }
    // Modes without a kernel run the rows.
    Ref<Image> fg = PatternImage(8, 6, DepthRGBAFlt32, 5), bg = PatternImage(8, 6, DepthRGBAFlt32, 6);
    for (int mode : {MrgDissolve, MrgOverlay, MrgSoftLight, MrgColorDodge, MrgHue, MrgLuminosity}) {
        const TagList tags{{MrgApplyMode, mode}};
        EXPECT_FALSE(MergeKernelSupports(MergeSettings::FromTags(tags))) << mode;
        Ref<Image> cpu = Blank(8, 6, DepthRGBAFlt32), dev = Blank(8, 6, DepthRGBAFlt32);
        ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), cpu.Get(), tags));
        DeviceRender render(ctx);
        const int launches = ctx->LaunchCount();
        ASSERT_TRUE(MergeImagesTagList(fg.Get(), bg.Get(), dev.Get(), render.On(tags)));
        EXPECT_EQ(ctx->LaunchCount(), launches) << mode;
        EXPECT_FALSE(dev->IsGPUMemDirty());
        EXPECT_TRUE(SameBits(*dev, *cpu)) << mode;
    }
    MergeSettings z; // a depth merge stays on the rows too
    z.zMerge = true;
    EXPECT_FALSE(MergeKernelSupports(z));
}

} // namespace
} // namespace Orvane::mergedevicetest
