// The Ultra Keyer as a tool: its controls, its pipeline against the steps run by hand in the documented order, a
// region against the whole frame, and the device against the rows.
#include <cmath>
#include <limits>

#include "host/flow/DocumentIO.h"
#include "operators/key/UltraKeyerSteps.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/color/ColorToolTestSupport.h"
#include "tests/support/KeyPlates.h"

namespace Orvane::ultrakeyertooltest {
namespace {
using namespace ::Orvane::Test;
using colortest::Rig;

struct UltraKeyerTool : ::testing::Test {
    static void SetUpTestSuite() { LoadOperators(); }
};

constexpr double kNone = std::numeric_limits<double>::quiet_NaN();

Ref<Image> RenderOn(Operator *op, IDeviceContext *device, const ImgRectI *roi = nullptr, RenderTask *task = nullptr) {
    RenderTask own;
    RenderTask &t = task ? *task : own;
    t.SetDevice(device);
    EvalOptions opt;
    opt.task = &t, opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    return EvalImage(op, 0.0, opt);
}

/// The test pattern over (2, 3)-(46, 30), canvas beyond: colours of every kind, some near the screen's.
Ref<Image> Plate(int depth = DepthRGBAFlt32) {
    return WindowedImage(48, 32, ImgRectI(2, 3, 46, 30), FltPixel{0.1f, 0.2f, 0.3f, 1.f}, 4, depth);
}

constexpr const char *kRangeIds[8] = {"RedLow",  "GreenLow",  "BlueLow",  "LuminanceLow",
                                      "RedHigh", "GreenHigh", "BlueHigh", "LuminanceHigh"};

const std::vector<std::pair<const char *, double>> kScreen = {
    {"BackgroundRed", 0.15}, {"BackgroundGreen", 0.75}, {"BackgroundBlue", 0.2}, {"SpillSuppression", 0}};

TEST_F(UltraKeyerTool, ControlsOfThePagesAndTheRangeReset) {
    OrvaneDoc doc;
    Operator *op = doc.AddTool(OvID("UltraKeyer"));
    ASSERT_TRUE(op);
    const struct {
        const char *id, *label, *page;
        double def, min, max;
    } controls[] = {
        {"BackgroundRed", "Background Red", "PreMatte", 0.5, kNone, kNone},
        {"Weight1", "Red Level", "PreMatte", 0.5, 0, 1},
        {"BackgroundCorrection", "Background Correction", "PreMatte", 0, 0, kNone},
        {"MatteSeparation", "Matte Separation", "PreMatte", 0, 0, 1},
        {"RedLow", "Red Low", "PreMatte", 0, kNone, kNone},
        {"LuminanceHigh", "Luminance High", "PreMatte", 1, kNone, kNone},
        {"LockColorPicking", "Lock Color Picking", "PreMatte", 0, 0, 1},
        {"PreMatteSize", "Pre Matte Size", "PreMatte", 0, 0, 50},
        {"SpillSuppression", "Spill Suppression", "Image", 1, 0, 1},
        {"InvertMatte", "Invert Matte", "Matte", 0, 0, 1},
        {"SubtractBackground", "Subtract Background", "Matte", 1, 0, 1},
    };
    for (const auto &c : controls) {
        SCOPED_TRACE(c.id);
        const Input *in = op->FindInput(c.id);
        ASSERT_TRUE(in);
        EXPECT_EQ(in->Name(), c.label);
        EXPECT_EQ(op->Pages()[in->Page()].name, c.page);
        const auto *def = dynamic_cast<const Number *>(in->Default().Get());
        ASSERT_TRUE(def);
        EXPECT_EQ(def->value, c.def);
        auto limit = [in](Tag tag) { return in->Tags().Has(tag) ? in->Tags().GetDouble(tag) : kNone; };
        auto same = [](double a, double b) { return a == b || (std::isnan(a) && std::isnan(b)); };
        EXPECT_PRED2(same, limit(InputMinAllowed), c.min);
        EXPECT_PRED2(same, limit(InputMaxAllowed), c.max);
    }
    EXPECT_TRUE(op->FindInput("LockColorPicking")->IsPassive());
    EXPECT_FALSE(op->FindInput("ResetPreMatteRanges")->IsExternal());
    // The button puts every range back to 0..1.
    SetNumbers(op, {{"RedLow", 0.3}, {"BlueHigh", 0.6}, {"LuminanceLow", 0.1}});
    SetNumber(op, "ResetPreMatteRanges", 1);
    for (const char *id : {"RedLow", "BlueHigh", "LuminanceLow"}) EXPECT_TRUE(op->FindInput(id)->IsDefault()) << id;
}

TEST_F(UltraKeyerTool, PipelineFollowsTheStepsInOrder) {
    Ref<Image> src = Plate();
    UltraKeyerSettings s;
    s.background[0] = 0.15, s.background[1] = 0.75, s.background[2] = 0.2;
    PreMatteRanges box; // about the screen's axes (0.33, 0.65, 0.38, 0.51)
    const float low[4] = {0.2f, 0.5f, 0.2f, 0.3f}, high[4] = {0.45f, 0.8f, 0.5f, 0.7f};
    std::copy(low, low + 4, box.low), std::copy(high, high + 4, box.high);
    // The steps by hand: soft matte, pre-matte cut, the colour following the cut.
    auto soft = [&](const UltraKeyerSettings &settings) {
        Ref<Image> dst = Blank(48, 32, DepthRGBAFlt32);
        EXPECT_TRUE(DoSoftUltraKeyer(nullptr, src.Get(), dst.Get(), DeriveUltraKeyerValues(settings), false));
        return dst;
    };
    Ref<Image> plain = soft(s), cut = soft(s), work = Blank(48, 32, DepthRGBAFlt32);
    ASSERT_TRUE(DoUltraKeyer(nullptr, src.Get(), work.Get(), box, false));
    ASSERT_TRUE(DoCombine(nullptr, work.Get(), cut.Get(), false));
    ASSERT_TRUE(DoSubtract(nullptr, src.Get(), cut.Get(), work.Get(), false));

    Rig rig("UltraKeyer", src);
    SetNumbers(rig.tool, kScreen);
    Ref<Image> out = RenderOn(rig.tool, nullptr);
    ASSERT_TRUE(out);
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 48, 32));
    EXPECT_EQ(out->GetCanvasColor(), src->GetCanvasColor());
    EXPECT_TRUE(SameBits(*out, *plain)) << "the soft matte alone";
    for (int i = 0; i < 8; ++i) SetNumber(rig.tool, kRangeIds[i], i < 4 ? low[i] : high[i % 4]);
    out = RenderOn(rig.tool, nullptr);
    ASSERT_TRUE(out);
    EXPECT_TRUE(SameBits(*out, *cut)) << "cut by the pre-matte";
    EXPECT_GT(MaxDiff(*cut, *plain, out->DataWindow()), 0.5) << "the pre-matte takes pixels out";
}

TEST_F(UltraKeyerTool, ARegionIsTheCropOfTheFrameAndTheDeviceGivesTheRowsResult) {
    // Sizes are lengths on a 720-wide frame: 45 is 3 pixels of this one. Each blur alone, so each reach counts.
    const std::vector<std::pair<const char *, double>> settings[] = {
        {{"RedLow", 0.2}, {"RedHigh", 0.45}, {"GreenLow", 0.5}, {"GreenHigh", 0.8}, {"PreMatteSize", 45}},
        {{"MatteBlur", 45}, {"BackgroundCorrection", 0.1}, {"MatteSeparation", 0.2}},
        {{"FringeSize", 45}, {"RedCyan", 0.5}, {"FringeShape", 1.4}},
        {{"SubtractBackground", 0}, {"InvertMatte", 1}}, // the soft matte as the device left it goes on
    };
    const ImgRectI roi(9, 7, 30, 21);
    IDeviceContext *ctx = OpenCLDevice();
    for (const auto &s : settings)
        for (int depth : {DepthRGBAFlt32, DepthRGBAInt16}) {
            Rig rig("UltraKeyer", Plate(depth));
            SetNumbers(rig.tool, kScreen);
            SetNumbers(rig.tool, s);
            Ref<Image> whole = RenderOn(rig.tool, nullptr), part = RenderOn(rig.tool, nullptr, &roi);
            ASSERT_TRUE(whole && part);
            EXPECT_TRUE(AllNear(*part, roi, 1e-6, [&](int x, int y) { return whole->GetFlt(x, y); }))
                << s.front().first;
            if (!ctx) continue;
            RenderTask task;
            Ref<Image> dev = RenderOn(rig.tool, ctx, nullptr, &task);
            ASSERT_TRUE(dev && task.DeviceLog().empty());
            EXPECT_LE(MaxDiff(*dev, *whole, whole->DataWindow()), depth == DepthRGBAFlt32 ? 1e-6 : 32.0 / 65535)
                << s.front().first << " " << depth;
        }
}

TEST_F(UltraKeyerTool, TheOldGarbageLinkMovesToTheGarbageMatteAndIsSavedThere) {
    Rig rig("UltraKeyer", Plate());
    SetNumbers(rig.tool, kScreen);
    Operator *mask = rig.doc.AddTool(OvID("EllipseMask"), "Matte");
    Operator *other = rig.doc.AddTool(OvID("RectangleMask"), "Other");
    ASSERT_TRUE(mask && other);
    Input *legacy = rig.tool->FindInput("GarbageMatte"), *garbage = rig.tool->FindInput("Garbage.Mask");
    Ref<Image> none = RenderOn(rig.tool, nullptr);
    ASSERT_TRUE(legacy->ConnectTo(mask->FindMainOutput()));
    EXPECT_EQ(legacy->Link(), nullptr);
    EXPECT_EQ(garbage->Link(), mask->FindMainOutput());
    Ref<Image> keyed = RenderOn(rig.tool, nullptr);
    ASSERT_TRUE(none && keyed);
    EXPECT_GT(MaxDiff(*none, *keyed, keyed->DataWindow()), 0.5) << "the mask took part of the matte away";
    EXPECT_NE(SaveDocument(rig.doc).find("[\"Garbage.Mask\"] = Matte.Mask"), std::string::npos);
    // A garbage matte already connected stays.
    ASSERT_TRUE(legacy->ConnectTo(other->FindMainOutput()));
    EXPECT_EQ(garbage->Link(), mask->FindMainOutput());
    EXPECT_EQ(legacy->Link(), nullptr);
}

TEST_F(UltraKeyerTool, KeysPlatesCloseToTheirTrueMattesAndTakesTheScreenOffTheColour) {
    // Screen colour set from the plate, nothing else tuned. A solid or a clear matte would be off by the plates'
    // screen or foreground share (a third or more); the soft matte is off by a few percent, mostly at edges.
    for (ScreenColor screen : {ScreenColor::Green, ScreenColor::Blue}) {
        const KeyPlate plate = MakeKeyPlate(KeyPlateKind::Everything, screen, 192, 108, 5);
        SCOPED_TRACE(plate.name);
        Rig rig("UltraKeyer", plate.composite);
        SetNumbers(rig.tool, {{"BackgroundRed", plate.screenR},
                              {"BackgroundGreen", plate.screenG},
                              {"BackgroundBlue", plate.screenB},
                              {"SpillSuppression", 0}});
        Ref<Image> subtracted = RenderOn(rig.tool, nullptr);
        SetNumber(rig.tool, "SubtractBackground", 0);
        Ref<Image> raw = RenderOn(rig.tool, nullptr);
        SetNumber(rig.tool, "SpillSuppression", 1);
        Ref<Image> despilled = RenderOn(rig.tool, nullptr);
        ASSERT_TRUE(subtracted && raw && despilled);
        const MatteScore score = ScoreMatte(*subtracted, *plate.trueAlpha);
        EXPECT_LT(score.meanError, 0.05);
        EXPECT_LT(score.edgeMeanError, 0.1);
        // Left on the colour, the screen shows at the edges; spill suppression takes part of it away, subtracting
        // the background (itself a despill: it takes the screen's share off) most of it.
        const double left = EdgeColourDistance(*raw, plate);
        EXPECT_LT(EdgeColourDistance(*despilled, plate), 0.8 * left);
        EXPECT_LT(EdgeColourDistance(*subtracted, plate), 0.4 * left);
    }
}

} // namespace
} // namespace Orvane::ultrakeyertooltest
