// Colour picking of the box keyers: the walk against a model written out
// here, on both kinds of axes, and picks sent to the tools as select
// commands, written back after the render or refused under the lock.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <string>
#include <vector>

#include "host/flow/ControlCommand.h"
#include "operators/key/RangePicker.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/operators/color/ColorToolTestSupport.h"
#include "tests/operators/key/KeyModels.h"

namespace Orvane::rangepickertest {
namespace {

using namespace keytest;
namespace Support = Orvane::Test;
using colortest::Render, colortest::Rig;
using RangePickerTool = colortest::ColorTool;

using Box = std::array<double, 8>; ///< four lows, then four highs
const Box kDefaults = {0, 0, 0, 0, 1, 1, 1, 1};
constexpr int kW = 20, kH = 10;

/// A colour of its own at every pixel, so that each edge of a rectangle counts.
FltPixel Gradient(int x, int y) { return {0.1f + 0.03f * x, 0.8f - 0.05f * y, 0.2f + 0.01f * (x + y), 1.f}; }

/// The walk over `pixels` of Gradient, in double.
Box ModelPick(const ImgRectI &pixels, int keyType, bool subtract, Box box) {
    if (!subtract && box == kDefaults)
        for (int i = 0; i < 4; ++i) box[i] = 1e30, box[4 + i] = -1e30;
    for (int y = pixels.y0; y < pixels.y1; ++y)
        for (int x = pixels.x0; x < pixels.x1; ++x) {
            const FltPixel p = Gradient(x, y);
            const std::array<double, 4> v = ChromaAxesModel(keyType, {p.R, p.G, p.B});
            for (int i = 0; i < 4; ++i) {
                double &low = box[i], &high = box[4 + i];
                if (!subtract)
                    low = std::min(low, v[i] - 3.0517578e-5), high = std::max(high, v[i] + 3.0517578e-5);
                else if (v[i] > low && v[i] < high)
                    (low + high > 2 * v[i] ? low : high) = v[i];
            }
        }
    return box;
}

void ExpectBox(const Box &got, const Box &want, const std::string &what) {
    for (int i = 0; i < 8; ++i) EXPECT_NEAR(got[i], want[i], 1e-6) << what << ", limit " << i;
}

TEST(RangePicker, WalksThePixelsUnderTheRectangleByTheRule) {
    Ref<Image> img = Support::Filled(kW, kH, DepthRGBAFlt32, Gradient);
    const double onRed = 0.1f; // pixel (0, 0)'s red
    const struct {
        const char *what;
        double left, bottom, right, top;
        ImgRectI pixels;
        int keyType;
        bool subtract;
        Box start;
    } cases[] = {
        {"chroma axes from the defaults, right and top edges in", 0, 0, 0.45, 0.9, {0, 0, 10, 10}, 0, false, kDefaults},
        {"plain colour from the defaults", 0.1, 0.2, 0.3, 0.5, {2, 2, 7, 6}, 1, false, kDefaults},
        {"a set box widens", 0.5, 0, 0.95, 0.3, {10, 0, 20, 4}, 1, false, {.3, .3, .3, .3, .5, .5, .5, .5}},
        {"subtracting from the defaults", 0.5, 0.5, 0.5, 0.5, {10, 5, 11, 6}, 0, true, kDefaults},
        {"subtracting moves the nearer limits",
         0.2,
         0.2,
         0.3,
         0.3,
         {4, 2, 7, 4},
         0,
         true,
         {.2, .2, .2, .2, .8, .8, .8, .8}},
        {"a value on a limit stays out", 0, 0, 0, 0, {0, 0, 1, 1}, 1, true, {0, 0, 0, 0, onRed, 1, 1, 1}},
        {"beyond the image", 1.5, 1.5, 2, 2, {30, 15, 41, 21}, 0, false, kDefaults},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(PickRectPixels(*img, c.left, c.bottom, c.right, c.top), c.pixels) << c.what;
        float low[4], high[4];
        for (int i = 0; i < 4; ++i)
            low[i] = static_cast<float>(c.start[i]), high[i] = static_cast<float>(c.start[4 + i]);
        const bool inside = !(c.pixels & img->DataWindow()).IsNull();
        EXPECT_EQ(PickRanges(*img, c.pixels, c.keyType, c.subtract, low, high), inside) << c.what;
        const Box got = {low[0], low[1], low[2], low[3], high[0], high[1], high[2], high[3]};
        ExpectBox(got, inside ? ModelPick(c.pixels, c.keyType, c.subtract, c.start) : c.start, c.what);
    }
}

TEST_F(RangePickerTool, PicksWriteTheRangesBackAfterTheRenderUnlessLocked) {
    static const char *const kIds[8] = {"RedLow",  "GreenLow",  "BlueLow",  "LuminanceLow",
                                        "RedHigh", "GreenHigh", "BlueHigh", "LuminanceHigh"};
    static const char *const kDeltaIds[8] = {"PreMatteLowRed",       "PreMatteLowGreen",     "PreMatteLowBlue",
                                             "PreMatteLowLuminance", "PreMatteHighRed",      "PreMatteHighGreen",
                                             "PreMatteHighBlue",     "PreMatteHighLuminance"};
    const struct {
        const char *tool;
        int keyType;
        const char *const *ids;
        const char *undo, *lock;
    } tools[] = {
        {"ChromaKeyer", 0, kIds, "ChromaKeyer Pick", "LockColorPicking"},
        {"ChromaKeyer", 1, kIds, "ChromaKeyer Pick", "LockColorPicking"},
        {"UltraKeyer", 0, kIds, "UltraKeyer Pick", "LockColorPicking"},
        {"DeltaKeyer", 1, kDeltaIds, "DeltaKeyer Pick Pre Matte", "PreMatteLockPicking"},
    };
    // Pixels 4..9 by 5..8 given with their corners swapped, then one pixel taken out.
    auto select = [](double x0, double y0, double x1, double y1, int modifiers) {
        return TagList{{CCMD_SelectLeft, x0 / kW},
                       {CCMD_SelectBottom, y0 / kH},
                       {CCMD_SelectRight, x1 / kW},
                       {CCMD_SelectTop, y1 / kH},
                       {CCMD_Modifiers, modifiers}};
    };
    const struct {
        TagList tags;
        ImgRectI pixels;
        bool subtract;
    } picks[] = {{select(9, 8, 4, 5, 0), ImgRectI(4, 5, 10, 9), false},
                 {select(6, 6, 6, 6, CCMD_ModSubtract), ImgRectI(6, 6, 7, 7), true}};
    for (const auto &t : tools) {
        const std::string what = std::string(t.tool) + " key type " + std::to_string(t.keyType);
        Rig rig(t.tool, Support::Filled(kW, kH, DepthRGBAFlt32, Gradient));
        if (std::string(t.tool) == "ChromaKeyer") Support::SetNumber(rig.tool, "KeyType", t.keyType);
        auto box = [&] {
            Box b;
            for (int i = 0; i < 8; ++i)
                b[i] = dynamic_cast<const Number &>(*rig.tool->FindInput(t.ids[i])->Constant()).value;
            return b;
        };
        for (const auto &p : picks) {
            const Box want = ModelPick(p.pixels, t.keyType, p.subtract, box());
            ASSERT_TRUE(rig.tool->ControlCommand(CCMD_Select, p.tags)) << what;
            ASSERT_TRUE(Render(rig.tool)) << what;
            EXPECT_EQ(rig.doc.RunDeferred(), std::vector<std::string>{t.undo}) << what;
            ExpectBox(box(), want, what + (p.subtract ? ", subtracting" : ""));
        }
        Support::SetNumber(rig.tool, t.lock, 1);
        EXPECT_FALSE(rig.tool->ControlCommand(CCMD_Select, select(0, 0, kW - 1, kH - 1, 0))) << what;
        ASSERT_TRUE(Render(rig.tool)) << what;
        EXPECT_TRUE(rig.doc.RunDeferred().empty()) << what;
        EXPECT_NE(Support::ConsoleText(rig.doc).find(rig.tool->Name() + ": Lock Color Picking is on"),
                  std::string::npos)
            << what;
    }
}

} // namespace
} // namespace Orvane::rangepickertest
