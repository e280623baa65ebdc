// Brightness / Contrast on the device against its rows: every control, both
// directions, float, integer and mask depths, windows that do not line up;
// and the device path's rules: no device for pre-calculation, inputs
// uploaded, results stale in main memory until downloaded, chains kept on
// the device, and a failing device giving the rows' result.
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include "host/krom/GPUMemory.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/color/BrightnessContrastReference.h"

namespace Orvane::bctest {
namespace {

/// A source whose data window is offset from the frame on every side.
Ref<Image> OddSource(int depth) {
    const ImgRectI dw(-3, 5, 50, 38);
    Ref<Image> img = Test::PatternImage(64, 40, depth, 5)->CopyOfImageTagList({{ImgDataWindow, &dw}});
    img->SetCanvasColor(FltPixel{0.2f, -0.1f, 0.6f, 0.5f});
    return img;
}

/// Largest difference over the data window and the canvas, relative to the
/// value's size above 1.
double MaxDifference(const Image &a, const Image &b) {
    EXPECT_EQ(a.DataWindow(), b.DataWindow());
    double worst = 0;
    auto diff = [&](const FltPixel &p, const FltPixel &q) {
        const Px x = ToPx(p), y = ToPx(q);
        for (int c = 0; c < 4; ++c)
            if (!std::isnan(x[c]) || !std::isnan(y[c]))
                worst = std::max(worst, std::fabs(x[c] - y[c]) / std::max(1.0, std::fabs(y[c])));
    };
    diff(a.GetCanvasColor(), b.GetCanvasColor());
    const ImgRectI dw = a.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) diff(a.GetFlt(x, y), b.GetFlt(x, y));
    return worst;
}

class BrightnessContrastDevice : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

TEST_F(BrightnessContrastDevice, MatchesTheRowsOverControlsDirectionsAndDepths) {
    ORVANE_NEED_OPENCL(ctx);
    const std::pair<const char *, Settings> cases[] = {
        {"gain, lift, gamma", {.gain = 1.3, .lift = 0.05, .gamma = 0.7}},
        {"contrast, brightness, saturation, clips",
         {.contrast = 0.4, .brightness = -0.1, .saturation = 1.6, .clipBlack = true, .clipWhite = true}},
        {"pre-divide, low/high", {.gain = 0.8, .low = 0.1, .high = 0.9, .prePost = true}},
        {"alpha only, high equals low",
         {.gamma = 1.8, .saturation = 0.3, .low = 0.2, .high = 0.2, .red = false, .alpha = true}},
        {"gain equals lift, contrast -1, gamma 0", {.gain = 2, .lift = 2, .gamma = 0, .contrast = -1}},
        {"gamma 2.2, no saturation", {.gamma = 2.2, .saturation = 0}},
        {"linear chain (one matrix)", {.gain = 1.2, .brightness = 0.1, .saturation = 1.4, .alpha = true}},
    };
    // Float results agree to float rounding of the power (the device's powf
    // against the host's); integers to one 16-bit step through the gamma
    // table and the fixed point contrast, four for 8 bits.
    const std::map<int, double> tolerance = {{DepthRGBAFlt32, 2e-5},        {DepthRGBAFlt16, 1e-3},
                                             {DepthRGBAInt16, 3.1 / 65535}, {DepthRGBAInt8, 1.01 / 255},
                                             {DepthAFlt32, 2e-5},           {DepthAInt16, 3.1 / 65535}};
    const ImgRectI roi(12, 2, 61, 33);
    for (const auto &[name, settings] : cases)
        for (bool reverse : {false, true})
            for (const auto &[depth, tol] : tolerance) {
                SCOPED_TRACE(std::string(name) + (reverse ? " reverse" : " forward") + " depth " +
                             std::to_string(depth));
                Rig rig(OddSource(depth));
                Settings s = settings;
                s.reverse = reverse;
                Apply(rig.bc, s);
                Ref<Image> cpu = Render(rig.bc, &roi);
                const int launches = ctx->LaunchCount();
                RenderTask task;
                Ref<Image> dev = Render(rig.bc, &roi, 0, ctx, &task);
                ASSERT_TRUE(cpu && dev);
                EXPECT_GT(ctx->LaunchCount(), launches) << "the device ran";
                EXPECT_TRUE(task.DeviceLog().empty()) << task.DeviceLog().front();
                EXPECT_LE(MaxDifference(*dev, *cpu), tol);
            }
}

TEST_F(BrightnessContrastDevice, WithoutGammaFloatResultsAreTheRowsBits) {
    ORVANE_NEED_OPENCL(ctx);
    for (bool reverse : {false, true}) {
        Rig rig(OddSource(DepthRGBAFlt32));
        Apply(rig.bc, {.gain = 1.3,
                       .contrast = 0.2,
                       .saturation = 0.6,
                       .low = 0.05,
                       .reverse = reverse,
                       .clipWhite = true,
                       .prePost = true});
        Ref<Image> cpu = Render(rig.bc), dev = Render(rig.bc, nullptr, 0, ctx);
        ASSERT_TRUE(cpu && dev);
        ASSERT_EQ(cpu->DataWindow(), dev->DataWindow());
        EXPECT_EQ(std::memcmp(cpu->ScanLine(cpu->DataWindow().y0), dev->ScanLine(dev->DataWindow().y0),
                              cpu->RowBytes() * cpu->DataWindow().Height()),
                  0);
    }
}

TEST_F(BrightnessContrastDevice, InputsAreUploadedAndResultsStayStaleUntilDownloaded) {
    ORVANE_NEED_OPENCL(ctx);
    Ref<Image> src = OddSource(DepthRGBAFlt32);
    Rig rig(src);
    Apply(rig.bc, {.gain = 1.1, .gamma = 1.5});
    // A pre-calculation never reaches the device.
    const int launches = ctx->LaunchCount();
    Ref<Image> shape = Render(rig.bc, nullptr, ReqFlagPreCalc, ctx);
    ASSERT_TRUE(shape);
    EXPECT_TRUE(shape->IsNoData());
    EXPECT_FALSE(shape->GetGPUMem());
    EXPECT_EQ(ctx->LaunchCount(), launches);

    EXPECT_FALSE(src->GetGPUMem());
    Ref<Image> dev = Render(rig.bc, nullptr, 0, ctx, nullptr, /*onDevice=*/true);
    ASSERT_TRUE(dev);
    EXPECT_EQ(ctx->LaunchCount(), launches + 1);
    // The CPU-made input was uploaded when its device image was made, and keeps it.
    ASSERT_TRUE(src->GetGPUMem());
    EXPECT_FALSE(src->IsGPUMemDirty());
    // The result lives on the device; main memory has nothing yet.
    EXPECT_TRUE(dev->IsGPUMemDirty());
    EXPECT_FALSE(dev->HasScanLineData());
    ASSERT_TRUE(dev->DownloadGPUMem());
    EXPECT_LE(MaxDifference(*dev, *Render(rig.bc)), 2e-5);
}

TEST_F(BrightnessContrastDevice, AChainStaysOnTheDevice) {
    ORVANE_NEED_OPENCL(ctx);
    Rig rig(OddSource(DepthRGBAFlt32));
    Operator *second = rig.AddAfter(rig.bc);
    Apply(rig.bc, {.gamma = 1.5});
    Apply(second, {.gamma = 1.5, .reverse = true});
    RenderTask task;
    task.SetDevice(ctx);
    EvalOptions opt;
    opt.task = &task;
    Ref<Parameter> middle = EvaluateOnDevice(rig.bc->FindMainOutput(), 0.0, opt); // cached for the next request
    auto *mid = dynamic_cast<Image *>(middle.Get());
    ASSERT_TRUE(mid && mid->IsGPUMemDirty());
    Ref<Parameter> last = Evaluate(second->FindMainOutput(), 0.0, opt);
    ASSERT_TRUE(last);
    // The second tool read the first one's image on the device: it never came back.
    EXPECT_FALSE(mid->HasScanLineData());
    // Forward then reverse with the same settings: the input again.
    EXPECT_LE(MaxDifference(*dynamic_cast<Image *>(last.Get()), *OddSource(DepthRGBAFlt32)), 1e-4);
}

/// A device that refuses to compile anything.
class RefusingDevice final : public IDeviceContext {
    struct Memory final : IDeviceMemory {
        Memory(IDeviceContext *c, size_t n) : IDeviceMemory(c, n), bytes(n) {}
        std::vector<uint8_t> bytes;
    };

public:
    DeviceBackend Backend() const override { return DeviceBackend::OpenCL; }
    std::string DeviceName() const override { return "refusing"; }
    std::string DriverKey() const override { return "refusing"; }
    std::shared_ptr<IDeviceMemory> Allocate(size_t n, std::string *) override {
        return std::make_shared<Memory>(this, n);
    }
    bool Write(IDeviceMemory &m, size_t at, const void *data, size_t n, std::string *) override {
        std::memcpy(static_cast<Memory &>(m).bytes.data() + at, data, n);
        return true;
    }
    bool Read(const IDeviceMemory &m, size_t at, void *data, size_t n, std::string *) override {
        std::memcpy(data, static_cast<const Memory &>(m).bytes.data() + at, n);
        return true;
    }

protected:
    std::shared_ptr<IDeviceKernel> Build(const std::string &, const std::string &, std::vector<KernelParamDecl>,
                                         std::string *log) override {
        *log = "refused";
        return nullptr;
    }
    bool DoLaunch(const IDeviceKernel &, const std::vector<KernelArgument> &, int, int, std::string *) override {
        return false;
    }
};

TEST_F(BrightnessContrastDevice, AFailingDeviceGivesTheRowsResult) {
    RefusingDevice refusing;
    for (const Settings &s : {Settings{.gamma = 1.7, .saturation = 1.2}, Settings{.gain = 1.5}}) {
        Rig rig(OddSource(DepthRGBAFlt32));
        Apply(rig.bc, s);
        Ref<Image> cpu = Render(rig.bc);
        RenderTask task;
        Ref<Image> fallback = Render(rig.bc, nullptr, 0, &refusing, &task);
        ASSERT_TRUE(cpu && fallback);
        EXPECT_EQ(MaxDifference(*fallback, *cpu), 0.0);
        ASSERT_EQ(task.DeviceLog().size(), 1u);
        EXPECT_NE(task.DeviceLog()[0].find("refused"), std::string::npos) << task.DeviceLog()[0];
    }
}

} // namespace
} // namespace Orvane::bctest
