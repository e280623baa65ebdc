// Channel Booleans: every operation and source against the formula written here in double, with a Foreground of
// another depth and data window (its canvas read beyond it), every Background depth; the frame without a
// Foreground; the defaults hand the Background on; the tool search finds it as "shuffle".
#include <gtest/gtest.h>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class ChannelBoolean : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

// Source numbers: channels 0-3 of the Background, 4-7 of the Foreground, then black, white, luminance of each.
enum { RBG, GBG, BBG, ABG, RFG, GFG, BFG, AFG, Black, White, LumaBG, LumaFG };

struct Case {
    const char *name;
    int to[4];
    int operation; // Copy, Add, Subtract, Multiply, Divide, Minimum, Maximum, Difference, Average
};

const Case kCases[] = {
    {"shuffle", {AFG, RBG, LumaFG, White}, 0},
    {"add the foreground", {RFG, GFG, BFG, AFG}, 1},
    {"subtract, crossed", {BFG, RFG, GBG, Black}, 2},
    {"multiply by luminance", {LumaBG, LumaFG, AFG, White}, 3},
    {"divide, by black too", {RFG, GFG, Black, AFG}, 4},
    {"minimum", {RFG, GFG, BFG, AFG}, 5},
    {"maximum", {AFG, LumaFG, BFG, RBG}, 6},
    {"difference", {RFG, GFG, BFG, AFG}, 7},
    {"average", {GFG, BBG, BFG, AFG}, 8},
};

double Luma(const Px &p) { return 0.2126 * p[0] + 0.7152 * p[1] + 0.0722 * p[2]; }

Px Expected(const Case &k, const Px &b, const Px &f) {
    Px out;
    for (int c = 0; c < 4; ++c) {
        const int s = k.to[c];
        const double v = s < 4         ? b[s]
                         : s < 8       ? f[s - 4]
                         : s == Black  ? 0
                         : s == White  ? 1
                         : s == LumaBG ? Luma(b)
                                       : Luma(f);
        const double ops[] = {v,
                              b[c] + v,
                              b[c] - v,
                              b[c] * v,
                              v == 0 ? 0 : b[c] / v,
                              std::min(b[c], v),
                              std::max(b[c], v),
                              std::fabs(b[c] - v),
                              (b[c] + v) / 2};
        out[c] = ops[k.operation];
    }
    return out;
}

void Apply(Operator *op, const Case &k) {
    Orvane::Test::SetNumbers(op, {{"ToRed", k.to[0]},
                                  {"ToGreen", k.to[1]},
                                  {"ToBlue", k.to[2]},
                                  {"ToAlpha", k.to[3]},
                                  {"Operation", k.operation}});
}

TEST_F(ChannelBoolean, EveryOperationAndSourceOverTwoImagesAtEveryDepth) {
    // The Foreground covers part of the Background's window and reaches past it.
    const FltPixel fgCanvas{0.1f, 0.3f, 0.f, 0.5f};
    for (int depth : kEveryDepth)
        for (int fgDepth : {DepthRGBAFlt16, DepthRGBAInt8}) {
            Ref<Image> bg = Orvane::Test::PatternImage(40, 12, depth, 6);
            Ref<Image> fg = Orvane::Test::WindowedImage(40, 12, ImgRectI(10, -2, 52, 7), fgCanvas, 7, fgDepth);
            Rig rig("ChannelBoolean", bg);
            Operator *fgSource = Orvane::Test::AddImageSource(rig.doc, "Fg", fg);
            ASSERT_TRUE(rig.tool->FindInput("Foreground")->ConnectTo(fgSource->FindMainOutput()));
            for (const Case &k : kCases) {
                const std::string what =
                    std::string(k.name) + " depth " + std::to_string(depth) + " over " + std::to_string(fgDepth);
                Apply(rig.tool, k);
                Ref<Image> out = Render(rig.tool);
                ASSERT_TRUE(out && out->DataWindow() == bg->DataWindow()) << what;
                for (int y = 0; y < 12; ++y)
                    for (int x = 0; x < 40; ++x) {
                        const Px f = fg->DataWindow().Contains(x, y) ? UnitPx(*fg, x, y) : ToPx(fgCanvas);
                        const Px e = Expected(k, UnitPx(*bg, x, y), f);
                        for (int c = 0; c < 4; ++c) {
                            const double want = Storable(depth, e[c]);
                            // Float rows work in float on a Foreground read as float.
                            ASSERT_NEAR(Unit(*out, x, y, c), want,
                                        StoredTolerance(depth, want) + 4e-7 * (1 + std::fabs(want)))
                                << what << " at " << x << "," << y << " channel " << c;
                        }
                    }
                const Px canvas = Expected(k, ToPx(bg->GetCanvasColor()), ToPx(fgCanvas)),
                         got = ToPx(out->GetCanvasColor());
                for (int c = 0; c < 4; ++c) EXPECT_NEAR(got[c], canvas[c], 1e-6) << what;
                // A region across the Foreground's edge holds the whole render's bits.
                const ImgRectI roi(5, 3, 33, 11);
                Ref<Image> part = Render(rig.tool, &roi);
                ASSERT_TRUE(part && part->DataWindow() == roi) << what;
                ExpectSameBits(*part, *out, roi);
            }
        }
}

TEST_F(ChannelBoolean, TheFrameHoldsWithoutAForegroundAndTheDefaultsHandOn) {
    for (const Case &k : {kCases[0], kCases[4]})
        ExpectFrame(
            "ChannelBoolean", [k](Operator *op) { Apply(op, k); }, [k](const Px &p) { return Expected(k, p, Px{}); },
            4e-7);
    Ref<Image> bg = Orvane::Test::PatternImage(8, 4);
    Rig rig("ChannelBoolean", bg);
    EXPECT_EQ(Render(rig.tool).Get(), bg.Get());
    const auto aliases = ClassRegistry->Find(OvID("ChannelBoolean"))->Tags().FindAll(RegAlias);
    ASSERT_EQ(aliases.size(), 1u);
    EXPECT_STREQ(aliases[0]->AsText(), "shuffle");
}

} // namespace
} // namespace Orvane::colortest
