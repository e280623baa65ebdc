// The broadcast-legal pass: colours whose luma or composite swing leave the
// limits are found, painted or brought back; legal colours are left alone.
// Luma, chroma amplitude and the limits are worked out here from the signal
// definitions (IRE levels, setup), not taken from the code.
#include <gtest/gtest.h>

#include <cmath>

#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"

namespace Orvane::imglegaltest {
namespace {

enum { NTSC, NHK, PAL };
enum { None, White, Black, Adjust };

struct Swing {
    double y, c;
};
Swing SwingOf(double r, double g, double b) {
    const double y = 0.299 * r + 0.587 * g + 0.114 * b;
    // U and V scale B - Y and R - Y so that 100% bars swing to -1/3 .. 4/3.
    const double u = 0.436 / 0.886 * (b - y), v = 0.615 / 0.701 * (r - y);
    return {y, std::hypot(u, v)};
}

/// Composite limits in units of the picture (0 black, 1 white) before setup.
void Limits(int type, int adjust, double &lo, double &hi) {
    const double setup = type == NTSC ? 0.075 : 0.0;
    double sigLo = -0.20, sigHi = 1.20; // IRE / 100
    if (type == PAL) sigLo = -1.0 / 3, sigHi = 4.0 / 3;
    lo = (sigLo - setup) / (1 - setup), hi = (sigHi - setup) / (1 - setup);
    if (adjust == 1) lo = std::max(lo, -0.25), hi = std::min(hi, 1.0);
}

bool Legal(int type, int adjust, double r, double g, double b, double tol = 1e-4) {
    double lo, hi;
    Limits(type, adjust, lo, hi);
    const Swing s = SwingOf(r, g, b);
    return s.y >= -tol && s.y <= 1 + tol && s.y - s.c >= lo - tol && s.y + s.c <= hi + tol;
}

struct Color {
    const char *name;
    float r, g, b;
};
const Color kColors[] = {
    {"black", 0, 0, 0},
    {"white", 1, 1, 1},
    {"grey", 0.5f, 0.5f, 0.5f},
    {"75% yellow", 0.75f, 0.75f, 0},
    {"75% blue", 0, 0, 0.75f},
    {"100% yellow", 1, 1, 0},
    {"100% red", 1, 0, 0},
    {"100% blue", 0, 0, 1},
    {"super white", 1.1f, 1.1f, 1.1f},
    {"below black", -0.05f, -0.05f, -0.05f},
    {"skin", 0.8f, 0.6f, 0.5f},
    {"wild", 1.2f, -0.1f, 0.9f},
};

Ref<Image> Strip(int depth) {
    const int n = static_cast<int>(std::size(kColors));
    Ref<Image> img = NewImageTagList({{ImgWidth, n}, {ImgHeight, 2}, {ImgDepth, depth}});
    img->AllocScanLineData();
    for (int i = 0; i < n; ++i)
        for (int y = 0; y < 2; ++y) img->PutFlt(i, y, {kColors[i].r, kColors[i].g, kColors[i].b, 0.75f});
    return img;
}

TEST(ImageLegal, KnownColoursAreJudgedAsTheLimitsSay) {
    // A few verdicts stated outright, so that the limits cannot drift together with the check.
    EXPECT_FALSE(Legal(NTSC, 0, 1, 1, 0)); // 100% yellow reaches 133 IRE
    EXPECT_TRUE(Legal(PAL, 0, 1, 1, 0));   // PAL passes 100% bars
    EXPECT_FALSE(Legal(PAL, 1, 1, 1, 0));
    EXPECT_TRUE(Legal(NTSC, 1, 0.75, 0.75, 0));
    EXPECT_FALSE(Legal(NHK, 0, 1, 0, 0)); // red dips to -33
    for (int depth : {DepthRGBAInt8, DepthRGBAFlt32})
        for (int type : {NTSC, NHK, PAL})
            for (int adjust : {0, 1})
                for (int action : {White, Black}) {
                    SCOPED_TRACE(testing::Message() << "depth " << depth << " type " << type << " adjust " << adjust
                                                    << " action " << action);
                    Ref<Image> src = Strip(depth);
                    Ref<Image> out = src->LegalOfImage(type, action, adjust, 0.0);
                    ASSERT_TRUE(out);
                    EXPECT_NE(out.Get(), src.Get());
                    int flagged = 0;
                    for (int i = 0; i < static_cast<int>(std::size(kColors)); ++i) {
                        const FltPixel before = src->GetFlt(i, 1), p = out->GetFlt(i, 1);
                        if (Legal(type, adjust, before.R, before.G, before.B)) {
                            EXPECT_EQ(p, before) << kColors[i].name;
                        } else {
                            const float flag = action == White ? 1.f : 0.f;
                            EXPECT_EQ(p, (FltPixel{flag, flag, flag, before.A})) << kColors[i].name;
                            ++flagged;
                        }
                    }
                    // Floats keep super white and below black, which every system rejects.
                    if (depth == DepthRGBAFlt32) {
                        EXPECT_GE(flagged, 2);
                    }
                }
    // Nothing to do: no action, or a mask.
    Ref<Image> src = Strip(DepthRGBAFlt32);
    src->ImageLegal(NTSC, None, 0, 0.0);
    Ref<Image> again = Strip(DepthRGBAFlt32);
    for (int i = 0; i < static_cast<int>(std::size(kColors)); ++i) EXPECT_EQ(src->GetFlt(i, 0), again->GetFlt(i, 0));
    Ref<Image> mask = NewImageTagList({{ImgWidth, 2}, {ImgHeight, 2}, {ImgDepth, DepthAFlt32}});
    mask->AllocScanLineData();
    mask->Fill({0, 0, 0, 1.5f});
    mask->ImageLegal(NTSC, Black, 0, 0.0);
    EXPECT_EQ(mask->GetFlt(1, 1).A, 1.5f);
}

TEST(ImageLegal, AdjustKeepsHueAndLumaAndEndsLegal) {
    for (int type : {NTSC, NHK, PAL})
        for (int adjust : {0, 1})
            for (double soft : {0.0, 0.1, 0.4}) {
                SCOPED_TRACE(testing::Message() << "type " << type << " adjust " << adjust << " soft " << soft);
                Ref<Image> img = Strip(DepthRGBAFlt32), orig = Strip(DepthRGBAFlt32);
                img->ImageLegal(type, Adjust, adjust, soft);
                for (int i = 0; i < static_cast<int>(std::size(kColors)); ++i) {
                    const Color &c = kColors[i];
                    const FltPixel p = img->GetFlt(i, 0);
                    EXPECT_TRUE(Legal(type, adjust, p.R, p.G, p.B)) << c.name;
                    EXPECT_EQ(p.A, 0.75f);
                    const Swing in = SwingOf(c.r, c.g, c.b), out = SwingOf(p.R, p.G, p.B);
                    if (in.y >= soft && in.y <= 1 - soft) {
                        EXPECT_NEAR(out.y, in.y, 1e-5) << c.name << ": luma kept";
                    }
                    // Hue: the colour minus its luma keeps its direction.
                    const double d[3] = {c.r - in.y, c.g - in.y, c.b - in.y};
                    const double e[3] = {p.R - out.y, p.G - out.y, p.B - out.y};
                    const double dot = d[0] * e[0] + d[1] * e[1] + d[2] * e[2];
                    const double nd = std::sqrt(d[0] * d[0] + d[1] * d[1] + d[2] * d[2]);
                    const double ne = std::sqrt(e[0] * e[0] + e[1] * e[1] + e[2] * e[2]);
                    if (ne > 1e-4) {
                        EXPECT_NEAR(dot / (nd * ne), 1.0, 1e-4) << c.name << ": hue kept";
                    }
                    if (soft == 0.0 && Legal(type, adjust, c.r, c.g, c.b, 0.0)) {
                        EXPECT_EQ(p, orig->GetFlt(i, 0)) << c.name << ": legal, untouched";
                    }
                }
            }
}

} // namespace
} // namespace Orvane::imglegaltest
