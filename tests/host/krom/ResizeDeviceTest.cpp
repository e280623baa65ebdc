// The resize kernels against the rows: floats bit for bit (the kernels sum in the rows' order), integers within
// the device's own rounding; and the fall-back to the rows.
#include "host/krom/GPUMemory.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/host/krom/DeviceTestSupport.h"

namespace Orvane {
namespace {
using namespace ::Orvane::Test;

TEST(DeviceResize, KernelsGiveTheRowsResultsAndNoDeviceTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    const std::tuple<int, int, int, int, int, double, double, double> cases[] = {
        {RszLanczos, EdgeDuplicate, EdgeDuplicate, DepthRGBAFlt32, DepthRGBAFlt32, 0.5, 0.5, 0},
        {RszLinear, EdgeCanvas, EdgeMirror, DepthRGBAFlt32, DepthRGBAFlt32, 1.7, 0.6, 0.3},
        {RszCatmullRom, EdgeWrap, EdgeCanvas, DepthRGBAInt16, DepthRGBAFlt32, 2.0, 3.0, -1.5},
        {RszMitchell, EdgeMirror, EdgeWrap, DepthRGBAFlt16, DepthRGBAFlt16, 0.37, 1.0, 0},
        {RszBox, EdgeDuplicate, EdgeCanvas, DepthRGBAInt8, DepthRGBAInt8, 0.25, 0.75, 0},
        {RszSinc, EdgeCanvas, EdgeDuplicate, DepthAFlt32, DepthAFlt32, 1.3, 0.8, 0.5},
        {RszNearest, EdgeWrap, EdgeWrap, DepthRGBAFlt32, DepthAInt16, 2.5, 2.5, 0},
    };
    const ImgRectI sw(-2, 1, 30, 19); // partly outside the source's frame
    for (const auto &[filter, ex, ey, sd, dd, sx, sy, ox] : cases) {
        SCOPED_TRACE(testing::Message() << "filter " << filter << " depths " << sd << "->" << dd);
        Ref<Image> src = PatternAt(29, 21, sd, 3, &sw);
        src->SetCanvasColor(FltPixel{0.1f, 0.2f, 0.3f, 0.4f});
        const int w = static_cast<int>(29 * sx + 0.5), h = static_cast<int>(21 * sy + 0.5);
        const ImgRectI dw(-3, 2, w + 4, h - 1); // reaching past the output's frame
        const TagList request{{ResizeFilter, filter}, {ResizeWindow, RszWindowKaiser},
                              {ResizeXScale, sx},     {ResizeYScale, sy},
                              {ResizeXOffset, ox},    {ResizeXEdges, ex},
                              {ResizeYEdges, ey}};
        Ref<Image> rows = Blank(w, h, dd, &dw), dev = Blank(w, h, dd, &dw), fallback = Blank(w, h, dd, &dw);
        ASSERT_TRUE(src->ResizeTagList(rows.Get(), request));
        DeviceRender render(ctx), bare(nullptr);
        const int launches = ctx->LaunchCount();
        ASSERT_TRUE(src->ResizeTagList(dev.Get(), render.On(request)));
        EXPECT_EQ(ctx->LaunchCount(), launches + 2) << "both passes ran on the device";
        for (const std::string &line : render.task.DeviceLog()) ADD_FAILURE() << line;
        ASSERT_TRUE(dev->IsGPUMemDirty() && dev->DownloadGPUMem());
        EXPECT_EQ(dev->GetCanvasColor(), rows->GetCanvasColor());
        // Integers: the device rounds its float product to the code, the rows in double.
        if (FormatOfDepth(dd).isFloat)
            EXPECT_TRUE(SameBits(*dev, *rows));
        else
            EXPECT_LE(MaxDiff(*dev, *rows, dw), 1.01 / 65535 + (dd == DepthRGBAInt8) / 255.0);
        // Without a device the rows make it.
        ASSERT_TRUE(src->ResizeTagList(fallback.Get(), bare.On(request)));
        EXPECT_FALSE(fallback->GetGPUMem());
        EXPECT_TRUE(SameBits(*fallback, *rows));
    }
}

} // namespace
} // namespace Orvane
