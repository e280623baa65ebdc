// The broadcast-legal pass against luma, chroma amplitude and limits worked out here from the signal
// definitions (IRE levels, setup): illegal colours found, painted or brought back, legal ones left alone.
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::imglegaltest {
namespace {
using namespace ::Orvane::Test;

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

/// Whether the colour's composite swing stays within the limits (0 black, 1 white, before setup), luma in 0..1.
bool Legal(int type, int adjust, double r, double g, double b, double tol = 1e-4) {
    const double setup = type == NTSC ? 0.075 : 0.0;
    const double sigLo = type == PAL ? -1.0 / 3 : -0.20, sigHi = type == PAL ? 4.0 / 3 : 1.20; // IRE / 100
    double lo = (sigLo - setup) / (1 - setup), hi = (sigHi - setup) / (1 - setup);
    if (adjust == 1) lo = std::max(lo, -0.25), hi = std::min(hi, 1.0);
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
    auto colour = [](int i, int) { return FltPixel{kColors[i].r, kColors[i].g, kColors[i].b, 0.75f}; };
    return Filled(static_cast<int>(std::size(kColors)), 2, depth, colour);
}

TEST(ImageLegal, KnownColoursAreJudgedAsTheLimitsSayAndAdjustedKeepingHueAndLuma) {
    // A few verdicts stated outright, so that the limits cannot drift together with the check.
    // 100% yellow reaches 133 IRE, PAL passes 100% bars, red dips to -33.
    EXPECT_TRUE(!Legal(NTSC, 0, 1, 1, 0) && Legal(PAL, 0, 1, 1, 0) && !Legal(PAL, 1, 1, 1, 0));
    EXPECT_TRUE(Legal(NTSC, 1, 0.75, 0.75, 0) && !Legal(NHK, 0, 1, 0, 0));
    const int n = static_cast<int>(std::size(kColors));
    for (int depth : {DepthRGBAInt8, DepthRGBAFlt32})
        for (int type : {NTSC, NHK, PAL})
            for (int adjust : {0, 1})
                for (int action : {White, Black}) {
                    Ref<Image> src = Strip(depth), out = src->LegalOfImage(type, action, adjust, 0.0);
                    ASSERT_TRUE(out && out.Get() != src.Get());
                    const float flag = action == White ? 1.f : 0.f;
                    for (int i = 0; i < n; ++i) {
                        const FltPixel before = src->GetFlt(i, 1);
                        const bool legal = Legal(type, adjust, before.R, before.G, before.B);
                        EXPECT_EQ(out->GetFlt(i, 1), (legal ? before : FltPixel{flag, flag, flag, before.A}))
                            << kColors[i].name << ": depth " << depth << " type " << type << " adjust " << adjust
                            << " action " << action;
                    }
                }
    // Nothing to do: no action, or a mask.
    Ref<Image> src = Strip(DepthRGBAFlt32), again = Strip(DepthRGBAFlt32);
    src->ImageLegal(NTSC, None, 0, 0.0);
    EXPECT_EQ(MaxDiff(*src, *again, src->DataWindow()), 0.0);
    Ref<Image> mask = Filled(2, 2, DepthAFlt32, [](int, int) { return FltPixel{0, 0, 0, 1.5f}; });
    mask->ImageLegal(NTSC, Black, 0, 0.0);
    EXPECT_EQ(mask->GetFlt(1, 1).A, 1.5f);
    // Adjusting keeps hue and luma and ends legal.
    for (int type : {NTSC, NHK, PAL})
        for (int adjust : {0, 1})
            for (double soft : {0.0, 0.1, 0.4}) {
                SCOPED_TRACE(testing::Message() << "type " << type << " adjust " << adjust << " soft " << soft);
                Ref<Image> img = Strip(DepthRGBAFlt32);
                img->ImageLegal(type, Adjust, adjust, soft);
                for (int i = 0; i < static_cast<int>(std::size(kColors)); ++i) {
                    const Color &c = kColors[i];
                    const FltPixel p = img->GetFlt(i, 0);
                    EXPECT_TRUE(Legal(type, adjust, p.R, p.G, p.B) && p.A == 0.75f) << c.name;
                    const Swing in = SwingOf(c.r, c.g, c.b), out = SwingOf(p.R, p.G, p.B);
                    EXPECT_TRUE(in.y < soft || in.y > 1 - soft || std::fabs(out.y - in.y) <= 1e-5)
                        << c.name << ": luma";
                    const bool untouched = soft == 0.0 && Legal(type, adjust, c.r, c.g, c.b, 0.0);
                    EXPECT_TRUE(!untouched || p == (FltPixel{c.r, c.g, c.b, 0.75f})) << c.name << ": legal, untouched";
                    // Hue: the colour minus its luma keeps its direction.
                    const double d[3] = {c.r - in.y, c.g - in.y, c.b - in.y},
                                 e[3] = {p.R - out.y, p.G - out.y, p.B - out.y};
                    const double ne = std::hypot(e[0], e[1], e[2]);
                    const double cosine =
                        (d[0] * e[0] + d[1] * e[1] + d[2] * e[2]) / (std::hypot(d[0], d[1], d[2]) * ne);
                    EXPECT_TRUE(ne <= 1e-4 || std::fabs(cosine - 1.0) <= 1e-4) << c.name << ": hue, " << cosine;
                }
            }
}

} // namespace
} // namespace Orvane::imglegaltest
