// The Delta Keyer as a tool: plates made here by mixing a foreground over a
// screen with known alpha come apart again into that alpha and the
// premultiplied foreground; the views; picking the pre-matte ranges.
#include <array>
#include <cmath>
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/color/ColorCurvesTable.h"
#include "host/flow/ControlCommand.h"
#include "host/flow/OrvaneDoc.h"
#include "operators/key/DeltaKeyerSteps.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/color/ColorToolTestSupport.h"
#include "tests/support/KeyPlates.h"

namespace Orvane::deltakeyertest {
namespace {

using colortest::Render;
using colortest::Rig;
using Rgb = std::array<double, 3>;

struct DeltaKeyerTool : ::testing::Test {
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

constexpr int kW = 33, kH = 2;
/// The foregrounds of the two rows: for a green key at balance 0.5 each has
/// green = (red + blue) / 2, no key of its own, so the plate unmixes exactly.
const Rgb kFore[kH] = {{0.6, 0.6, 0.6}, {0.8, 0.5, 0.2}};
double AlphaAt(int x) { return x / double(kW - 1); }

/// alpha x F + (1 - alpha) x B(x), alpha rising from 0 on the left to 1 on the right.
Ref<Image> Plate(const std::function<Rgb(int)> &screen) {
    auto img = MakeRef<Image>(kW, kH, DepthRGBAFlt32);
    img->AllocScanLineData();
    for (int y = 0; y < kH; ++y)
        for (int x = 0; x < kW; ++x) {
            const double a = AlphaAt(x);
            const Rgb b = screen(x);
            FltPixel p{};
            float *c = &p.R;
            for (int k = 0; k < 3; ++k) c[k] = static_cast<float>(a * kFore[y][k] + (1 - a) * b[k]);
            p.A = 1.f;
            img->PutFlt(x, y, p);
        }
    return img;
}
Ref<Image> Screen(const std::function<Rgb(int)> &screen) {
    auto img = MakeRef<Image>(kW, kH, DepthRGBAFlt32);
    img->AllocScanLineData();
    for (int y = 0; y < kH; ++y)
        for (int x = 0; x < kW; ++x) {
            const Rgb b = screen(x);
            img->PutFlt(x, y, {float(b[0]), float(b[1]), float(b[2]), 1.f});
        }
    return img;
}

const Rgb kGreen{0.1, 0.7, 0.25};
void SetBackground(Operator *tool, const Rgb &b) {
    Orvane::Test::SetNumbers(tool, {{"BackgroundRed", b[0]}, {"BackgroundGreen", b[1]}, {"BackgroundBlue", b[2]}});
}

/// Expects the key of the plate: alpha, and the foreground premultiplied by it.
void ExpectUnmixed(const Image &out, double tol) {
    for (int y = 0; y < kH; ++y)
        for (int x = 0; x < kW; ++x) {
            const double a = AlphaAt(x);
            const FltPixel p = out.GetFlt(x, y);
            ASSERT_NEAR(p.A, a, tol) << x << "," << y;
            ASSERT_NEAR(p.R, a * kFore[y][0], tol) << x << "," << y;
            ASSERT_NEAR(p.G, a * kFore[y][1], tol) << x << "," << y;
            ASSERT_NEAR(p.B, a * kFore[y][2], tol) << x << "," << y;
        }
}

TEST_F(DeltaKeyerTool, APlateComesApartIntoItsAlphaAndForeground) {
    Rig rig("DeltaKeyer", Plate([](int) { return kGreen; }));
    SetBackground(rig.tool, kGreen);
    Ref<Image> out = Render(rig.tool);
    ASSERT_TRUE(out);
    ExpectUnmixed(*out, 2e-6);
    // The same with a screen that drifts across the frame, given as a clean plate.
    auto drift = [](int x) { return Rgb{0.08 + 0.004 * x, 0.75 - 0.006 * x, 0.2 + 0.002 * x}; };
    Rig clean("DeltaKeyer", Plate(drift));
    SetBackground(clean.tool, kGreen);
    Orvane::Test::ImageSourceTool *plate = Orvane::Test::AddImageSource(clean.doc, "Plate", Screen(drift));
    ASSERT_TRUE(clean.tool->FindInput("Clean")->ConnectTo(plate->FindMainOutput()));
    out = Render(clean.tool);
    ASSERT_TRUE(out);
    ExpectUnmixed(*out, 2e-6);
}

TEST_F(DeltaKeyerTool, AGreyBackgroundKeysNothing) {
    Ref<Image> src = Plate([](int) { return kGreen; });
    Rig rig("DeltaKeyer", src);
    SetBackground(rig.tool, {0.4, 0.4, 0.4});
    Ref<Image> out = Render(rig.tool);
    ASSERT_TRUE(out);
    for (int x = 0; x < kW; ++x)
        Orvane::Test::ExpectPixelNear(out->GetFlt(x, 1), src->GetFlt(x, 1), 0, std::to_string(x));
}

TEST_F(DeltaKeyerTool, ViewsShowTheMatteTheRangesAndTheStatus) {
    Rig rig("DeltaKeyer", Plate([](int) { return kGreen; }));
    SetBackground(rig.tool, kGreen);
    Orvane::Test::SetID(rig.tool, "ViewMode", "Matte");
    Ref<Image> matte = Render(rig.tool);
    Orvane::Test::SetID(rig.tool, "ViewMode", "PreMatte");
    Ref<Image> pre = Render(rig.tool);
    Orvane::Test::SetID(rig.tool, "ViewMode", "Status");
    Ref<Image> status = Render(rig.tool);
    Orvane::Test::SetID(rig.tool, "ViewMode", "TuningRanges");
    Ref<Image> tuning = Render(rig.tool);
    ASSERT_TRUE(matte && pre && status && tuning);
    const ColorCurvesTable table;
    Ref<Image> src = Plate([](int) { return kGreen; });
    for (int x = 0; x < kW; ++x) {
        const float a = static_cast<float>(AlphaAt(x));
        Orvane::Test::ExpectPixelNear(matte->GetFlt(x, 0), {a, a, a, a}, 2e-6, "matte " + std::to_string(x));
        Orvane::Test::ExpectPixelNear(pre->GetFlt(x, 0), {1, 1, 1, 1}, 0, "no ranges: nothing is screen");
        const float level = x == 0 ? 0.f : (x == kW - 1 ? 1.f : 0.5f);
        Orvane::Test::ExpectPixelNear(status->GetFlt(x, 0), {level, level, level, a}, 2e-6,
                                      "status " + std::to_string(x));
        const FltPixel s = src->GetFlt(x, 1);
        float w[3];
        table.WeightsAt(std::max({s.R, s.G, s.B}), w[0], w[1], w[2]);
        Orvane::Test::ExpectPixelNear(tuning->GetFlt(x, 1), {w[0], w[1], w[2], 1}, 0, "tuning " + std::to_string(x));
    }
}

TEST_F(DeltaKeyerTool, APickSetsThePreMatteRangesAfterTheRender) {
    // Picking the clear left columns of the plate: the ranges close around the screen colour.
    Rig rig("DeltaKeyer", Plate([](int) { return kGreen; }));
    SetBackground(rig.tool, kGreen);
    ASSERT_TRUE(Render(rig.tool));
    const TagList pick{
        {CCMD_SelectLeft, 0.0}, {CCMD_SelectBottom, 0.0}, {CCMD_SelectRight, 0.01}, {CCMD_SelectTop, 0.9}};
    ASSERT_TRUE(rig.tool->ControlCommand(CCMD_Select, pick));
    ASSERT_TRUE(Render(rig.tool));
    EXPECT_EQ(rig.doc.RunDeferred(), std::vector<std::string>{"DeltaKeyer Pick Pre Matte"});
    const double y = 0.299 * kGreen[0] + 0.587 * kGreen[1] + 0.114 * kGreen[2];
    const char *axes[4] = {"Red", "Green", "Blue", "Luminance"};
    const double want[4] = {kGreen[0], kGreen[1], kGreen[2], y};
    for (int i = 0; i < 4; ++i) {
        auto value = [&](const std::string &id) {
            return dynamic_cast<const Number *>(rig.tool->FindInput(id.c_str())->Constant().Get())->value;
        };
        EXPECT_NEAR(value("PreMatteLow" + std::string(axes[i])), want[i] - 3.0517578e-5, 1e-6) << axes[i];
        EXPECT_NEAR(value("PreMatteHigh" + std::string(axes[i])), want[i] + 3.0517578e-5, 1e-6) << axes[i];
    }
    // The picked ranges hold the screen: the pre-matte is 0 there and 1 on the foreground.
    Orvane::Test::SetID(rig.tool, "ViewMode", "PreMatte");
    Ref<Image> pre = Render(rig.tool);
    ASSERT_TRUE(pre);
    EXPECT_EQ(pre->GetFlt(0, 0).R, 0.f);
    EXPECT_EQ(pre->GetFlt(kW - 1, 0).R, 1.f);
    // A locked tool refuses the pick.
    Orvane::Test::SetNumber(rig.tool, "PreMatteLockPicking", 1);
    EXPECT_FALSE(rig.tool->ControlCommand(CCMD_Select, pick));
}

// The keying plates (grain, uneven screen, spill, hair, veils): a clean plate
// beats the flat background colour, the threshold cleans the grain off the
// screen, and restoring the fringe gives back the edges the threshold hardened.
TEST_F(DeltaKeyerTool, CleanPlateThresholdAndFringeEachImproveThePlateScores) {
    namespace kp = Orvane::Test;
    for (kp::ScreenColor screen : {kp::ScreenColor::Green, kp::ScreenColor::Blue}) {
        const kp::KeyPlate plate = kp::MakeKeyPlate(kp::KeyPlateKind::Everything, screen, 320, 180, 7);
        SCOPED_TRACE(plate.name);
        auto score = [&](bool clean, const std::vector<std::pair<const char *, double>> &settings) {
            Rig rig("DeltaKeyer", plate.composite);
            SetBackground(rig.tool, {plate.screenR, plate.screenG, plate.screenB});
            kp::SetNumbers(rig.tool, settings);
            if (clean) {
                kp::ImageSourceTool *c = kp::AddImageSource(rig.doc, "Clean", plate.cleanScreen);
                EXPECT_TRUE(rig.tool->FindInput("Clean")->ConnectTo(c->FindMainOutput()));
            }
            Ref<Image> out = Render(rig.tool);
            EXPECT_TRUE(out);
            return out ? kp::ScoreMatte(*out, *plate.trueAlpha) : kp::MatteScore{1, 1, 1};
        };
        const std::vector<std::pair<const char *, double>> threshold = {{"LowThreshold", 0.1}, {"HighThreshold", 0.9}};
        std::vector<std::pair<const char *, double>> restore = threshold;
        restore.push_back({"RestoreFringe", 0.003});
        const kp::MatteScore flat = score(false, {}), clean = score(true, {}), hard = score(true, threshold),
                             fringe = score(true, restore);
        EXPECT_LT(clean.meanError, 0.8 * flat.meanError);
        EXPECT_LT(hard.meanError, 0.8 * clean.meanError);
        EXPECT_GT(hard.edgeMeanError, clean.edgeMeanError) << "the threshold hardens the edges";
        EXPECT_LT(fringe.edgeMeanError, hard.edgeMeanError) << "restoring the fringe softens them again";
        EXPECT_LT(fringe.meanError, 0.015);
    }
}

// The whole chain on the device gives the rows' key: every step's kernel, the
// host's blurs on the device, and the host steps between them on the rows.
TEST_F(DeltaKeyerTool, TheDeviceChainGivesTheRowsKey) {
    ORVANE_NEED_OPENCL(ctx);
    namespace kp = Orvane::Test;
    const kp::KeyPlate plate = kp::MakeKeyPlate(kp::KeyPlateKind::Everything, kp::ScreenColor::Green, 160, 90, 3);
    Rig rig("DeltaKeyer", plate.composite);
    SetBackground(rig.tool, {plate.screenR, plate.screenG, plate.screenB});
    kp::ImageSourceTool *c = kp::AddImageSource(rig.doc, "Clean", plate.cleanScreen);
    ASSERT_TRUE(rig.tool->FindInput("Clean")->ConnectTo(c->FindMainOutput()));
    kp::SetNumbers(rig.tool, {{"PreMatteLowGreen", 0.5},
                              {"PreMatteHighRed", 0.3},
                              {"PreMatteSoftRange", 0.05},
                              {"LowThreshold", 0.05},
                              {"HighThreshold", 0.95},
                              {"RestoreFringe", 0.004},
                              {"CleanForeground", 0.1},
                              {"SolidSourceAlpha", 2},
                              {"AlphaMidtonesGain", 1.2},
                              {"LockAlphaSpillTuning", 0}});
    kp::SetID(rig.tool, "ReplaceMode", "HardColor");
    for (const char *view : {"Final", "Status", "Intermediate", "Matte"}) {
        SCOPED_TRACE(view);
        kp::SetID(rig.tool, "ViewMode", view);
        Ref<Image> cpu = Render(rig.tool);
        RenderTask task;
        task.SetDevice(ctx);
        EvalOptions opt;
        opt.task = &task, opt.useCache = false;
        const int launches = ctx->LaunchCount();
        Ref<Image> dev = kp::EvalImage(rig.tool, 0.0, opt);
        ASSERT_TRUE(cpu && dev);
        EXPECT_GT(ctx->LaunchCount(), launches + 4) << "the steps ran on the device";
        ASSERT_EQ(cpu->DataWindow(), dev->DataWindow());
        for (int y = cpu->DataWindow().y0; y < cpu->DataWindow().y1; ++y)
            for (int x = cpu->DataWindow().x0; x < cpu->DataWindow().x1; ++x)
                kp::ExpectPixelNear(dev->GetFlt(x, y), cpu->GetFlt(x, y), 1e-4,
                                    std::to_string(x) + "," + std::to_string(y));
    }
}

// A region of interest gives the same pixels as the whole frame: the image
// inputs are asked for the blurs' reach around it.
TEST_F(DeltaKeyerTool, ARegionGivesTheWholeFramesPixels) {
    namespace kp = Orvane::Test;
    const kp::KeyPlate plate = kp::MakeKeyPlate(kp::KeyPlateKind::Hair, kp::ScreenColor::Blue, 120, 80, 5);
    Rig rig("DeltaKeyer", plate.composite);
    SetBackground(rig.tool, {plate.screenR, plate.screenG, plate.screenB});
    kp::SetNumbers(rig.tool, {{"LowThreshold", 0.1}, {"RestoreFringe", 0.01}, {"Blur", 2.0}, {"PreBlur", 1.0}});
    Ref<Image> whole = Render(rig.tool);
    const ImgRectI roi(40, 20, 80, 50);
    rig.source->cutToRegion = true; // the source gives only what it is asked for
    Ref<Image> part = Render(rig.tool, &roi);
    ASSERT_TRUE(whole && part);
    ASSERT_TRUE(part->DataWindow().Contains(roi));
    for (int y = roi.y0; y < roi.y1; ++y)
        for (int x = roi.x0; x < roi.x1; ++x)
            kp::ExpectPixelNear(part->GetFlt(x, y), whole->GetFlt(x, y), 1e-6,
                                std::to_string(x) + "," + std::to_string(y));
}

// The buttons reset the ranges and set the curves; a lock hides the spill
// controls that follow the alpha's, and a tuning unlocked makes two records.
TEST_F(DeltaKeyerTool, ButtonsAndLocks) {
    OrvaneDoc doc;
    Operator *dk = doc.AddTool(OvID("DeltaKeyer"));
    ASSERT_TRUE(dk);
    Orvane::Test::SetNumbers(dk, {{"PreMatteLowGreen", 0.4}, {"PreMatteHighLuminance", 0.8}});
    dk->FindInput("ResetPreMatteRanges")->SetValue(MakeRef<Number>(1.0));
    EXPECT_TRUE(dk->FindInput("PreMatteLowGreen")->IsDefault());
    EXPECT_TRUE(dk->FindInput("PreMatteHighLuminance")->IsDefault());
    Input *curves = dk->FindInput("TuningRanges");
    dk->FindInput("PresetSmoothRanges")->SetValue(MakeRef<Number>(1.0));
    EXPECT_TRUE(curves->Constant()->Equals(ColorCurvesTable(ColorCurvesTable::Preset::Smooth)));
    dk->FindInput("PresetSimpleRanges")->SetValue(MakeRef<Number>(1.0));
    EXPECT_TRUE(curves->Constant()->Equals(ColorCurvesTable()));
    struct Case {
        const char *lock, *follower;
    } cases[] = {{"LockAlphaSpillReference", "SpillReferenceGreen"}, {"LockAlphaSpillTuning", "SpillMidtonesGain"}};
    for (const Case &c : cases) {
        EXPECT_FALSE(dk->FindInput(c.follower)->IsVisible()) << c.follower << " locked by default";
        Orvane::Test::SetNumber(dk, c.lock, 0);
        EXPECT_TRUE(dk->FindInput(c.follower)->IsVisible()) << c.follower;
        Orvane::Test::SetNumber(dk, c.lock, 1);
        EXPECT_FALSE(dk->FindInput(c.follower)->IsVisible()) << c.follower;
    }
    // With the tuning unlocked the spill gains key the colour: the alpha of a
    // plate stays, its colour moves.
    Rig rig("DeltaKeyer", Plate([](int) { return kGreen; }));
    SetBackground(rig.tool, kGreen);
    Ref<Image> locked = Render(rig.tool);
    Orvane::Test::SetNumbers(rig.tool, {{"LockAlphaSpillTuning", 0}, {"SpillMidtonesGain", 1.5}});
    Ref<Image> unlocked = Render(rig.tool);
    ASSERT_TRUE(locked && unlocked);
    const FltPixel a = locked->GetFlt(kW / 2, 0), b = unlocked->GetFlt(kW / 2, 0);
    EXPECT_FLOAT_EQ(a.A, b.A);
    EXPECT_GT(std::fabs(a.G - b.G), 1e-3);
}

} // namespace
} // namespace Orvane::deltakeyertest
