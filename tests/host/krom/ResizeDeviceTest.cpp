// The resize kernels ("ResizeAcross", "ResizeDown") against the rows: float
// outputs bit for bit (the kernels sum in the rows' order), integer outputs
// within the device's own rounding, over filters, edge policies, source and
// output windows and depths; and the fall-back to the rows.
#include <cstring>

#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/ResizeFilters.h"
#include "host/krom/DeviceContext.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

Ref<Image> Blank(int w, int h, int depth, const ImgRectI &dw) {
    return NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}, {ImgDataWindow, &dw}});
}

TEST(DeviceResize, KernelsGiveTheRowsResults) {
    ORVANE_NEED_OPENCL(ctx);
    struct Case {
        int filter, ex, ey, sd, dd;
        double sx, sy, ox;
    };
    const Case cases[] = {
        {RszLanczos, EdgeDuplicate, EdgeDuplicate, DepthRGBAFlt32, DepthRGBAFlt32, 0.5, 0.5, 0},
        {RszLinear, EdgeCanvas, EdgeMirror, DepthRGBAFlt32, DepthRGBAFlt32, 1.7, 0.6, 0.3},
        {RszCatmullRom, EdgeWrap, EdgeCanvas, DepthRGBAInt16, DepthRGBAFlt32, 2.0, 3.0, -1.5},
        {RszMitchell, EdgeMirror, EdgeWrap, DepthRGBAFlt16, DepthRGBAFlt16, 0.37, 1.0, 0},
        {RszBox, EdgeDuplicate, EdgeCanvas, DepthRGBAInt8, DepthRGBAInt8, 0.25, 0.75, 0},
        {RszSinc, EdgeCanvas, EdgeDuplicate, DepthAFlt32, DepthAFlt32, 1.3, 0.8, 0.5},
        {RszNearest, EdgeWrap, EdgeWrap, DepthRGBAFlt32, DepthAInt16, 2.5, 2.5, 0},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << "filter " << c.filter << " depths " << c.sd << "->" << c.dd);
        // The source's data window sits partly outside its frame; the output's reaches past its own.
        const ImgRectI sw(-2, 1, 30, 19);
        Ref<Image> src = Blank(29, 21, c.sd, sw);
        src->AllocScanLineData();
        src->ImageCopy(Orvane::Test::PatternImage(29, 21, DepthRGBAFlt32, 3).Get());
        src->SetCanvasColor(FltPixel{0.1f, 0.2f, 0.3f, 0.4f});
        const int w = static_cast<int>(29 * c.sx + 0.5), h = static_cast<int>(21 * c.sy + 0.5);
        const ImgRectI dw(-3, 2, w + 4, h - 1);
        const TagList request{{ResizeFilter, c.filter}, {ResizeWindow, RszWindowKaiser}, {ResizeXScale, c.sx},
                              {ResizeYScale, c.sy},     {ResizeXOffset, c.ox},           {ResizeXEdges, c.ex},
                              {ResizeYEdges, c.ey}};
        Ref<Image> rows = Blank(w, h, c.dd, dw), dev = Blank(w, h, c.dd, dw);
        ASSERT_TRUE(src->ResizeTagList(rows.Get(), request));

        RenderTask task;
        task.SetDevice(ctx);
        Request req(nullptr, nullptr, 0.0, 0, &task);
        TagList onDevice = request;
        onDevice.Set({WorkUseGPU, 1});
        onDevice.Set({WorkRequest, &req});
        const int launches = ctx->LaunchCount();
        ASSERT_TRUE(src->ResizeTagList(dev.Get(), onDevice));
        EXPECT_EQ(ctx->LaunchCount(), launches + 2) << "both passes ran on the device";
        for (const std::string &line : task.DeviceLog()) ADD_FAILURE() << line;
        EXPECT_TRUE(dev->IsGPUMemDirty());
        ASSERT_TRUE(dev->DownloadGPUMem());
        EXPECT_EQ(dev->GetCanvasColor(), rows->GetCanvasColor());
        if (FormatOfDepth(c.dd).isFloat) {
            for (int y = dw.y0; y < dw.y1; ++y)
                ASSERT_EQ(std::memcmp(dev->ScanLine(y), rows->ScanLine(y), rows->RowBytes()), 0) << "row " << y;
            continue;
        }
        // Integers: the device rounds its float product to the code, the rows in double.
        for (int y = dw.y0; y < dw.y1; ++y)
            for (int x = dw.x0; x < dw.x1; ++x) {
                const FltPixel a = dev->GetFlt(x, y), b = rows->GetFlt(x, y);
                ASSERT_NEAR(a.R, b.R, 1.01 / 65535 + (c.dd == DepthRGBAInt8) / 255.0) << x << "," << y;
                ASSERT_NEAR(a.A, b.A, 1.01 / 65535 + (c.dd == DepthRGBAInt8) / 255.0) << x << "," << y;
            }
    }
}

TEST(DeviceResize, WithoutADeviceTheRowsMakeIt) {
    Ref<Image> src = Orvane::Test::PatternImage(16, 12, DepthRGBAFlt32, 9);
    const ImgRectI dw(0, 0, 8, 6);
    Ref<Image> rows = Blank(8, 6, DepthRGBAFlt32, dw), fallback = Blank(8, 6, DepthRGBAFlt32, dw);
    ASSERT_TRUE(src->ResizeTagList(rows.Get(), {{ResizeFilter, RszLanczos}}));
    RenderTask task; // no device
    Request req(nullptr, nullptr, 0.0, 0, &task);
    ASSERT_TRUE(src->ResizeTagList(fallback.Get(), {{ResizeFilter, RszLanczos}, {WorkUseGPU, 1}, {WorkRequest, &req}}));
    EXPECT_FALSE(fallback->GetGPUMem());
    for (int y = 0; y < 6; ++y) ASSERT_EQ(std::memcmp(fallback->ScanLine(y), rows->ScanLine(y), rows->RowBytes()), 0);
}

} // namespace
} // namespace Orvane
