// Brightness / Contrast on the device against its rows: every control, both
// directions, float, integer and mask depths, windows that do not line up;
// and the device path's rules: no device for pre-calculation, inputs
// uploaded, results stale in main memory until downloaded, chains kept on
// the device, and a failing device giving the rows' result.
#include <algorithm>
#include <cmath>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/flow/Engine.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/krom/GPUMemory.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

using Settings = std::vector<std::pair<const char *, double>>;

/// A source whose data window is offset from the frame on every side.
Ref<Image> OddSource(int depth) {
    Ref<Image> full = Orvane::Test::PatternImage(64, 40, depth, 5);
    const ImgRectI dw(-3, 5, 50, 38);
    Ref<Image> img = full->CopyOfImageTagList({{ImgDataWindow, &dw}});
    img->SetCanvasColor(FltPixel{0.2f, -0.1f, 0.6f, 0.5f});
    return img;
}

Ref<Image> Render(Operator *op, IDeviceContext *device, const ImgRectI *roi, RenderTask *task = nullptr,
                  uint32_t flags = 0, bool onDevice = false) {
    RenderTask own;
    RenderTask &t = task ? *task : own;
    t.SetDevice(device);
    EvalOptions opt;
    opt.task = &t;
    opt.flags = flags;
    opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    Ref<Parameter> p =
        onDevice ? EvaluateOnDevice(op->FindMainOutput(), 0.0, opt) : Evaluate(op->FindMainOutput(), 0.0, opt);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

/// Largest difference over the data window and the canvas, relative to the
/// value's size above 1.
double MaxDifference(const Image &a, const Image &b) {
    EXPECT_EQ(a.DataWindow(), b.DataWindow());
    double worst = 0;
    auto diff = [&](const FltPixel &p, const FltPixel &q) {
        const float x[4] = {p.R, p.G, p.B, p.A}, y[4] = {q.R, q.G, q.B, q.A};
        for (int c = 0; c < 4; ++c) {
            if (std::isnan(x[c]) && std::isnan(y[c])) continue;
            worst = std::max(worst, std::fabs(double(x[c]) - y[c]) / std::max(1.0, std::fabs(double(y[c]))));
        }
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
    Operator *MakeBC(OrvaneDoc &doc, Ref<Image> src, const Settings &settings) {
        auto *source = Orvane::Test::AddImageSource(doc, "Source", std::move(src));
        Operator *bc = doc.AddTool(OvID("BrightnessContrast"), "BC");
        EXPECT_TRUE(bc && source);
        bc->FindInput("Input")->ConnectTo(source->Out());
        for (const auto &[id, v] : settings) Orvane::Test::SetNumber(bc, id, v);
        return bc;
    }
};

TEST_F(BrightnessContrastDevice, MatchesTheRowsOverControlsDirectionsAndDepths) {
    ORVANE_NEED_OPENCL(ctx);
    const std::vector<std::pair<const char *, Settings>> cases = {
        {"gain, lift, gamma", {{"Gain", 1.3}, {"Lift", 0.05}, {"Gamma", 0.7}}},
        {"contrast, brightness, saturation, clips",
         {{"Contrast", 0.4}, {"Brightness", -0.1}, {"Saturation", 1.6}, {"ClipBlack", 1}, {"ClipWhite", 1}}},
        {"pre-divide, low/high", {{"PreDividePostMultiply", 1}, {"Gain", 0.8}, {"Low", 0.1}, {"High", 0.9}}},
        {"alpha only, high equals low",
         {{"Alpha", 1}, {"Red", 0}, {"Gamma", 1.8}, {"Saturation", 0.3}, {"Low", 0.2}, {"High", 0.2}}},
        {"gain equals lift, contrast -1, gamma 0", {{"Gain", 2}, {"Lift", 2}, {"Contrast", -1}, {"Gamma", 0}}},
        {"gamma 2.2, no saturation", {{"Gamma", 2.2}, {"Saturation", 0}}},
        {"linear chain (one matrix)", {{"Gain", 1.2}, {"Brightness", 0.1}, {"Saturation", 1.4}, {"Alpha", 1}}},
    };
    // Float results agree to float rounding of the power (the device's powf
    // against the host's); integers to one 16-bit step through the gamma
    // table and the fixed point contrast, four for 8 bits.
    const std::map<int, double> tolerance = {{DepthRGBAFlt32, 2e-5},        {DepthRGBAFlt16, 1e-3},
                                             {DepthRGBAInt16, 3.1 / 65535}, {DepthRGBAInt8, 1.01 / 255},
                                             {DepthAFlt32, 2e-5},           {DepthAInt16, 3.1 / 65535}};
    const ImgRectI roi(12, 2, 61, 33);
    for (const auto &[name, settings] : cases)
        for (int direction : {0, 1})
            for (const auto &[depth, tol] : tolerance) {
                SCOPED_TRACE(std::string(name) + (direction ? " reverse" : " forward") + " depth " +
                             std::to_string(depth));
                OrvaneDoc doc;
                Settings s = settings;
                s.push_back({"Direction", direction});
                Operator *bc = MakeBC(doc, OddSource(depth), s);
                Ref<Image> cpu = Render(bc, nullptr, &roi);
                const int launches = ctx->LaunchCount();
                RenderTask task;
                Ref<Image> dev = Render(bc, ctx, &roi, &task);
                ASSERT_TRUE(cpu && dev);
                EXPECT_GT(ctx->LaunchCount(), launches) << "the device ran";
                EXPECT_TRUE(task.DeviceLog().empty()) << task.DeviceLog().front();
                EXPECT_LE(MaxDifference(*dev, *cpu), tol);
            }
}

TEST_F(BrightnessContrastDevice, WithoutGammaFloatResultsAreTheRowsBits) {
    ORVANE_NEED_OPENCL(ctx);
    for (int direction : {0, 1}) {
        OrvaneDoc doc;
        Operator *bc = MakeBC(doc, OddSource(DepthRGBAFlt32),
                              {{"Gain", 1.3},
                               {"Contrast", 0.2},
                               {"Saturation", 0.6},
                               {"Low", 0.05},
                               {"ClipWhite", 1},
                               {"PreDividePostMultiply", 1},
                               {"Direction", direction}});
        Ref<Image> cpu = Render(bc, nullptr, nullptr), dev = Render(bc, ctx, nullptr);
        ASSERT_TRUE(cpu && dev);
        ASSERT_EQ(cpu->DataWindow(), dev->DataWindow());
        EXPECT_EQ(std::memcmp(cpu->ScanLine(cpu->DataWindow().y0), dev->ScanLine(dev->DataWindow().y0),
                              cpu->RowBytes() * cpu->DataWindow().Height()),
                  0);
    }
}

TEST_F(BrightnessContrastDevice, PreCalculationNeverReachesTheDevice) {
    ORVANE_NEED_OPENCL(ctx);
    OrvaneDoc doc;
    Operator *bc = MakeBC(doc, OddSource(DepthRGBAFlt32), {{"Gamma", 1.5}});
    const int launches = ctx->LaunchCount();
    Ref<Image> shape = Render(bc, ctx, nullptr, nullptr, ReqFlagPreCalc);
    ASSERT_TRUE(shape);
    EXPECT_TRUE(shape->IsNoData());
    EXPECT_FALSE(shape->GetGPUMem());
    EXPECT_EQ(ctx->LaunchCount(), launches);
    ASSERT_TRUE(Render(bc, ctx, nullptr));
    EXPECT_EQ(ctx->LaunchCount(), launches + 1);
}

TEST_F(BrightnessContrastDevice, InputsAreUploadedAndResultsStayStaleUntilDownloaded) {
    ORVANE_NEED_OPENCL(ctx);
    OrvaneDoc doc;
    Ref<Image> src = OddSource(DepthRGBAFlt32);
    Operator *bc = MakeBC(doc, src, {{"Gamma", 1.5}, {"Gain", 1.1}});
    EXPECT_FALSE(src->GetGPUMem());
    Ref<Image> dev = Render(bc, ctx, nullptr, nullptr, 0, /*onDevice=*/true);
    ASSERT_TRUE(dev);
    // The CPU-made input was uploaded when its device image was made, and keeps it.
    ASSERT_TRUE(src->GetGPUMem());
    EXPECT_FALSE(src->IsGPUMemDirty());
    // The result lives on the device; main memory has nothing yet.
    EXPECT_TRUE(dev->IsGPUMemDirty());
    EXPECT_FALSE(dev->HasScanLineData());
    ASSERT_TRUE(dev->DownloadGPUMem());
    Ref<Image> cpu = Render(bc, nullptr, nullptr);
    EXPECT_LE(MaxDifference(*dev, *cpu), 2e-5);
}

TEST_F(BrightnessContrastDevice, AChainStaysOnTheDevice) {
    ORVANE_NEED_OPENCL(ctx);
    OrvaneDoc doc;
    Operator *first = MakeBC(doc, OddSource(DepthRGBAFlt32), {{"Gamma", 1.5}});
    Operator *second = doc.AddTool(OvID("BrightnessContrast"), "BC2");
    second->FindInput("Input")->ConnectTo(first->FindMainOutput());
    Orvane::Test::SetNumber(second, "Gamma", 1.5);
    Orvane::Test::SetNumber(second, "Direction", 1);
    RenderTask task;
    task.SetDevice(ctx);
    EvalOptions opt;
    opt.task = &task;
    Ref<Parameter> middle = EvaluateOnDevice(first->FindMainOutput(), 0.0, opt); // cached for the next request
    auto *mid = dynamic_cast<Image *>(middle.Get());
    ASSERT_TRUE(mid && mid->IsGPUMemDirty());
    Ref<Parameter> last = Evaluate(second->FindMainOutput(), 0.0, opt);
    ASSERT_TRUE(last);
    // The second tool read the first one's image on the device: it never came back.
    EXPECT_FALSE(mid->HasScanLineData());
    // Forward then reverse with the same settings: the input again.
    Ref<Image> src = OddSource(DepthRGBAFlt32);
    EXPECT_LE(MaxDifference(*dynamic_cast<Image *>(last.Get()), *src), 1e-4);
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
    for (const Settings &s : {Settings{{"Gamma", 1.7}, {"Saturation", 1.2}}, Settings{{"Gain", 1.5}}}) {
        OrvaneDoc doc;
        Operator *bc = MakeBC(doc, OddSource(DepthRGBAFlt32), s);
        Ref<Image> cpu = Render(bc, nullptr, nullptr);
        RenderTask task;
        Ref<Image> fallback = Render(bc, &refusing, nullptr, &task);
        ASSERT_TRUE(cpu && fallback);
        EXPECT_EQ(MaxDifference(*fallback, *cpu), 0.0);
        ASSERT_EQ(task.DeviceLog().size(), 1u);
        EXPECT_NE(task.DeviceLog()[0].find("refused"), std::string::npos) << task.DeviceLog()[0];
    }
}

} // namespace
} // namespace Orvane
