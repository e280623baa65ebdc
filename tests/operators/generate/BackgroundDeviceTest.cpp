// Background's ramps on the device against its rows: float frames are the
// rows' bits (the kernel does the rows' arithmetic in their order); integer
// frames, which the rows build by fixed point steps, agree to one step.
#include <cstring>

#include "host/image/PixelConvert.h"
#include "host/krom/GPUMemory.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/generate/BackgroundTestSupport.h"

namespace Orvane::BgTest {
namespace {

using BackgroundDevice = BackgroundSuite;

TEST_F(BackgroundDevice, RampsMatchTheRowsInEveryModeAndDepth) {
    ORVANE_NEED_OPENCL(ctx);
    const double tl[4] = {0.9, 0.2, 0.1, 1}, tr[4] = {0.1, 0.8, 0.3, 0.7}, bl[4] = {0.0, 0.3, 0.9, 1},
                 br[4] = {0.5, 0.5, 0.05, 0.4};
    SetColor(bg, "TopLeft", tl);
    SetColor(bg, "TopRight", tr);
    SetColor(bg, "BottomLeft", bl);
    SetColor(bg, "BottomRight", br);
    const ImgRectI roi(7, 3, 97, 55); // lines up with nothing
    for (const char *type : {"SolidColor", "Horizontal", "Vertical", "FourCorner"})
        for (int choice : {4, 3, 2, 1}) { // float32, float16, int16, int8
            const int depth = choice + 4;
            SCOPED_TRACE(std::string(type) + " depth " + std::to_string(depth));
            Frame(101, 57, type);
            SetNumber(bg, "Depth", choice);
            EvalOptions cpuOpt;
            cpuOpt.useCache = false;
            cpuOpt.roi = ImageDomain(roi);
            Ref<Image> cpu = Render(bg, cpuOpt);
            RenderTask task;
            task.SetDevice(ctx);
            EvalOptions devOpt = cpuOpt;
            devOpt.task = &task;
            const int launches = ctx->LaunchCount();
            Ref<Image> dev = Render(bg, devOpt);
            ASSERT_TRUE(cpu && dev);
            ASSERT_EQ(cpu->Depth(), depth);
            EXPECT_EQ(ctx->LaunchCount(), launches + 1);
            EXPECT_EQ(dev->IsOpaque(), cpu->IsOpaque());
            ASSERT_EQ(dev->DataWindow(), cpu->DataWindow());
            const ImgRectI dw = cpu->DataWindow();
            if (FormatOfDepth(depth).isFloat) {
                EXPECT_EQ(std::memcmp(dev->ScanLine(dw.y0), cpu->ScanLine(dw.y0), cpu->RowBytes() * dw.Height()), 0);
                continue;
            }
            for (int y = dw.y0; y < dw.y1; ++y)
                for (int x = dw.x0; x < dw.x1; ++x) {
                    Pixel a, b;
                    LoadPixel(depth, dev->PixelAddress(x, y), 1, &a);
                    LoadPixel(depth, cpu->PixelAddress(x, y), 1, &b);
                    const int step = depth == DepthRGBAInt8 ? 257 : 1;
                    ASSERT_LE(std::abs(a.R - b.R), step) << x << "," << y;
                    ASSERT_LE(std::abs(a.G - b.G), step) << x << "," << y;
                    ASSERT_LE(std::abs(a.B - b.B), step) << x << "," << y;
                    ASSERT_LE(std::abs(a.A - b.A), step) << x << "," << y;
                }
        }
}

TEST_F(BackgroundDevice, FieldRequestsUseTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    Frame(32, 20, "Vertical");
    const Ref<Image> rows = RenderField(bg, 1);
    // The same field request, now from a render that has a device.
    RenderTask task;
    task.SetDevice(ctx);
    Output *out = bg->FindMainOutput();
    Request req(bg, out, 0.0, 0, &task);
    req.SetField(1);
    for (const auto &in : bg->Inputs()) req.SlotOf(in.get()).data = in->ValueAt(0.0);
    const int launches = ctx->LaunchCount();
    bg->Process(&req);
    auto *field = dynamic_cast<Image *>(req.GetOutputData(out));
    ASSERT_TRUE(field && rows);
    EXPECT_EQ(ctx->LaunchCount(), launches); // the kernel has no field form
    EXPECT_FALSE(field->GetGPUMem());
    ASSERT_EQ(field->DataWindow(), rows->DataWindow());
    EXPECT_EQ(std::memcmp(field->ScanLine(0), rows->ScanLine(0), rows->RowBytes() * rows->DataWindow().Height()), 0);
}

} // namespace
} // namespace Orvane::BgTest
