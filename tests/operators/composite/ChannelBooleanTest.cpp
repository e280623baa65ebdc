#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using ChannelBoolean = ColorTool;
using Case = std::array<int, 5>; ///< the source of red, green, blue and alpha, then the operation

// Sources: channels 0-3 of the Background, 4-7 of the Foreground, black, white, luminance of each. Operations: Copy,
// Add, Subtract, Multiply, Divide, Minimum, Maximum, Difference, Average.
enum { RBG, GBG, BBG, ABG, RFG, GFG, BFG, AFG, Black, White, LumaBG, LumaFG };
const Case kCases[] = {{AFG, RBG, LumaFG, White, 0},    {RFG, GFG, BFG, AFG, 1},   {BFG, RFG, GBG, Black, 2},
                       {LumaBG, LumaFG, AFG, White, 3}, {RFG, GFG, Black, AFG, 4}, {RFG, GFG, BFG, AFG, 5},
                       {AFG, LumaFG, BFG, RBG, 6},      {RFG, GFG, BFG, AFG, 7},   {GFG, BBG, BFG, AFG, 8}};

static Px Expected(const Case &k, const Px &b, const Px &f) {
    auto luma = [](const Px &p) { return 0.2126 * p[0] + 0.7152 * p[1] + 0.0722 * p[2]; };
    Px out;
    for (int c = 0; c < 4; ++c) {
        const int s = k[c];
        const double v = s < 4 ? b[s] : s < 8 ? f[s - 4] : s == Black ? 0 : s == White ? 1 : luma(s == LumaBG ? b : f);
        const double a = b[c], q = v == 0 ? 0 : a / v;
        const double r[] = {v, a + v, a - v, a * v, q, std::min(a, v), std::max(a, v), std::fabs(a - v), (a + v) / 2};
        out[c] = r[k[4]];
    }
    return out;
}

static Setter Apply(const Case &k) {
    return Numbers({{"ToRed", k[0]}, {"ToGreen", k[1]}, {"ToBlue", k[2]}, {"ToAlpha", k[3]}, {"Operation", k[4]}});
}

TEST_F(ChannelBoolean, EveryOperationAndSourceOverTwoImagesAtEveryDepthTheFrameAndTheDefaultsHandOn) {
    const FltPixel fgCanvas{0.1f, 0.3f, 0.f, 0.5f};
    // The Foreground, 8-bit or half float, covers part of the Background's window and reaches past it.
    for (int depth : kEveryDepth) {
        const int fgDepth = depth == DepthRGBAInt8 ? DepthRGBAFlt16 : DepthRGBAInt8;
        Ref<Image> bg = PatternImage(40, 12, depth, 6);
        Ref<Image> fg = WindowedImage(40, 12, ImgRectI(10, -2, 52, 7), fgCanvas, 7, fgDepth);
        Rig rig("ChannelBoolean", bg);
        ASSERT_TRUE(rig.tool->FindInput("Foreground")->ConnectTo(AddImageSource(rig.doc, "Fg", fg)->FindMainOutput()));
        EXPECT_EQ(Render(rig.tool).Get(), bg.Get()) << "the defaults hand the Background on";
        for (const Case &k : kCases) {
            const std::string what = "operation " + std::to_string(k[4]) + " depth " + std::to_string(depth);
            Apply(k)(rig.tool);
            Ref<Image> out = Render(rig.tool);
            ASSERT_TRUE(out && out->DataWindow() == bg->DataWindow()) << what;
            // Float rows work in float on a Foreground read as float.
            for (int y = 0; y < 12; ++y)
                for (int x = 0; x < 40; ++x)
                    ExpectPx(depth, PxAt(*out, x, y), Expected(k, PxAt(*bg, x, y), PxAt(*fg, x, y)), 4e-7, what);
            ExpectPx(DepthRGBAFlt32, ToPx(out->GetCanvasColor()), // within 1e-6: results lie in -1..1
                     Expected(k, ToPx(bg->GetCanvasColor()), ToPx(fgCanvas)), 4.7e-7, what + " canvas");
        }
    }
    // Without a Foreground, its channels read as 0.
    const auto model = [](const Case &k) { return [k](const Px &p) { return Expected(k, p, Px{}); }; };
    ExpectFrame("ChannelBoolean", {{Apply(kCases[0]), model(kCases[0])}, {Apply(kCases[4]), model(kCases[4])}}, 4e-7);
}

} // namespace Orvane::colortest
