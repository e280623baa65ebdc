#include "host/matte/MatteSteps.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/PixelMemory.h"
#include "host/matte/MaskInputs.h"
#include "tests/support/TestSupport.h"

namespace Orvane::mattestepstest {
namespace {
namespace ts = ::Orvane::Test;

float &Ch(FltPixel &p, int c) { return c == 0 ? p.R : c == 1 ? p.G : c == 2 ? p.B : p.A; }

/// Half a step of the depth (float16 relative to the value), or a few float32 roundings.
double Tolerance(int depth, float want) {
    const double steps[] = {0.51 / 255, 0.51 / 65535, 5e-4, 2e-6};
    const int type = static_cast<int>(FormatOfDepth(depth).type);
    return steps[type] * (type >= 2 ? std::max(1.f, std::abs(want)) : 1.f);
}

/// Expects `got` over its frame and two pixels around it near want(x, y),
/// held to 0..1 in an integer image's window; a mask by its value alone.
void ExpectEveryPixel(const Image &got, const std::function<FltPixel(int x, int y)> &want) {
    for (int y = -2; y < got.Height() + 2; ++y)
        for (int x = -2; x < got.Width() + 2; ++x) {
            FltPixel g = got.GetFlt(x, y), w = want(x, y);
            for (int c = got.IsMask() ? 3 : 0; c < 4; ++c) {
                const float e =
                    !got.IsFloat() && got.DataWindow().Contains(x, y) ? std::clamp(Ch(w, c), 0.f, 1.f) : Ch(w, c);
                ASSERT_NEAR(Ch(g, c), e, Tolerance(got.Depth(), e)) << "pixel " << x << "," << y << " channel " << c;
            }
        }
}

/// fn() with pixel memory held to what is in use; expects a refusal to be noted.
bool UnderTightMemory(const std::function<bool()> &fn) {
    const size_t pool = PixelPoolLimit();
    SetPixelPoolLimit(0); // pooled blocks would make room
    SetPixelMemoryLimit(PixelMemoryInUse() + 1024);
    const bool done = fn();
    SetPixelMemoryLimit(0);
    SetPixelPoolLimit(pool);
    EXPECT_FALSE(TakePixelRefusal().empty());
    return done;
}

double Contract(double a, double c) {
    if (c >= 1) return a > 0 ? 1 : a;
    if (c <= -1) return a < 1 ? 0 : a;
    return c >= 0 ? std::min(1.0, a / (1 - c)) : std::max(0.0, (a + c) / (1 + c));
}

/// A point step with its arguments: for Spill the key channel, method and
/// amount; Levels the channel, low, high, contrast, gamma; InFill the amount;
/// Fringe shape and the three shifts; Invert the channel.
enum Kind { Spill, Levels, InFill, Fringe, Invert, PostMultiply };
struct Step {
    Kind kind;
    int channel;
    double p[4] = {};
    bool ColourOnly() const { return kind == Spill || kind == Fringe || kind == PostMultiply; }
};

bool RunStep(const Step &s, Image *img, const Image *edge) {
    const double *p = s.p;
    const TagList levels{{MatteLevelsChannel, s.channel},
                         {MatteLevelsLow, p[0]},
                         {MatteLevelsHigh, p[1]},
                         {MatteLevelsContrast, p[2]},
                         {MatteLevelsGamma, p[3]}};
    switch (s.kind) {
    case Spill: return MatteCore_DoSpill(nullptr, img, {s.channel, p[1], static_cast<int>(p[0])});
    case Levels: return (img->IsFloat() ? DoLevelsFlt : DoLevels)(nullptr, img, levels);
    case InFill: return MatteCore_DoInFill(nullptr, img, p[0]);
    case Fringe:
        return (img->IsFloat() ? MatteCore_DoFringeFlt : MatteCore_DoFringe)(nullptr, img, edge, p[0], p[1], p[2],
                                                                             p[3]);
    case Invert: return MatteCore_DoInvert(nullptr, img, s.channel);
    default: return MatteCore_DoPostMultiply(nullptr, img);
    }
}

/// The step's formula on one pixel, in double; e is the edge matte's value there.
void Model(const Step &s, FltPixel &px, double e) {
    const double *p = s.p;
    const double v = Ch(px, s.channel);
    switch (s.kind) {
    case Spill: {
        const double a = Ch(px, s.channel == 2 ? 1 : 0), b = Ch(px, s.channel == 0 ? 1 : 2), k = Ch(px, 2 - s.channel);
        const double lo = std::min(a, b), hi = std::max(a, b);
        const double limit[] = {hi, (a + b) / 2, lo, std::max(0.0, (3 * lo - hi) / 2)};
        Ch(px, 2 - s.channel) = static_cast<float>(std::max(0.0, k - p[1] * std::max(0.0, k - limit[int(p[0])])));
        return;
    }
    case Levels: {
        const double a1 = p[1] > p[0] ? std::clamp((v - p[0]) / (p[1] - p[0]), 0.0, 1.0) : v >= p[1];
        Ch(px, s.channel) = static_cast<float>(std::pow(Contract(a1, p[2]), 1 / p[3]));
        return;
    }
    case InFill: Ch(px, s.channel) = static_cast<float>(Contract(v, p[0])); return;
    case Fringe: {
        const double m = std::clamp(e, 0.0, 1.0), w = 4 * m * (1 - m);
        for (int c = 0; c < 3; ++c) Ch(px, c) = static_cast<float>(Ch(px, c) * (1 + w * (p[0] - 1)) + w * p[1 + c]);
        return;
    }
    case Invert: Ch(px, s.channel) = static_cast<float>(1 - v); return;
    default: px = {px.R * px.A, px.G * px.A, px.B * px.A, px.A};
    }
}

TEST(MatteSteps, PointStepsFollowTheirFormulasAtEveryDepthOnPixelsAndCanvasAndStopWhenAbandoned) {
    // Levels: the third has high below low; the last two contract and expand all the way.
    const Step steps[] = {{Spill, 1, {SpillRare, 1.0}},
                          {Spill, 0, {SpillMedium, 0.6}},
                          {Spill, 2, {SpillWellDone, 1.5}},
                          {Spill, 1, {SpillBurnt, 1.0}},
                          {Levels, 3, {0, 1, 0, 1}},
                          {Levels, 3, {0.2, 0.7, 0.3, 2.2}},
                          {Levels, 3, {0.6, 0.4, 0, 1}},
                          {Levels, 0, {0.1, 0.9, -0.5, 0.5}},
                          {Levels, 3, {0, 1, 1, 1}},
                          {Levels, 3, {0, 1, -1, 1}},
                          {InFill, 3, {0.4}},
                          {InFill, 3, {-0.3}},
                          {InFill, 3, {1}},
                          {InFill, 3, {-1}},
                          {Fringe, 3, {1.3, 0.2, -0.1, 0.05}},
                          {Invert, 1},
                          {Invert, 3},
                          {PostMultiply, 3}};
    const ImgRectI window(3, 2, 13, 10);
    const FltPixel canvas{0.3f, 0.7f, 0.2f, 0.6f};
    // The edge matte reaches beyond the image's window on two sides.
    Ref<Image> edge = ts::WindowedImage(16, 12, {1, 4, 15, 9}, {0, 0, 0, 0.4f}, 7, DepthAFlt32);
    const std::atomic<bool> stop{true};
    for (const Step &s : steps) {
        for (const int depth :
             {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32, DepthAInt8}) {
            SCOPED_TRACE("step " + std::to_string(&s - steps) + ", " + DepthName(depth));
            Ref<Image> img = ts::WindowedImage(16, 12, window, canvas, 3, depth), before = CopyOfImage(img.Get());
            ASSERT_TRUE(RunStep(s, img.Get(), edge.Get()));
            auto want = [&](FltPixel p, float e) { // a mask holds the worked channel's value in all four places
                if (img->IsMask() && s.ColourOnly()) return p;
                if (img->IsMask()) p = {p.A, p.A, p.A, p.A};
                Model(s, p, e);
                const float v = Ch(p, s.channel);
                return img->IsMask() ? FltPixel{v, v, v, v} : p;
            };
            // Beyond the image's window lies its canvas, worked in float with the edge's canvas.
            ExpectEveryPixel(*img, [&](int x, int y) {
                return want(before->GetFlt(x, y), window.Contains(x, y) ? edge->GetFlt(x, y).A : 0.4f);
            });
            ts::ExpectPixelNear(img->GetCanvasColor(), want(canvas, 0.4f), 2e-6, "canvas");
            if (::testing::Test::HasFailure()) return;
        }
        Ref<Image> img = ts::WindowedImage(16, 12, window, canvas, 3, DepthRGBAInt16), before = CopyOfImage(img.Get());
        img->SetAbortFlag(&stop);
        EXPECT_FALSE(RunStep(s, img.Get(), edge.Get()));
        ExpectEveryPixel(*img, [&](int x, int y) { return before->GetFlt(x, y); });
    }
}

TEST(MatteSteps, FormsRefuseTheOtherKindOfImageBadArgumentsAndMemoryTheyCannotHave) {
    Ref<Image> flt = ts::PatternImage(4, 3, DepthRGBAFlt32), word = ts::PatternImage(4, 3, DepthRGBAInt16);
    const bool done[] = {DoLevels(nullptr, flt.Get(), {}),
                         DoLevelsFlt(nullptr, word.Get(), {}),
                         MatteCore_DoFringe(nullptr, flt.Get(), word.Get(), 2, 0.5, 0, 0),
                         MatteCore_DoFringeFlt(nullptr, word.Get(), flt.Get(), 2, 0.5, 0, 0),
                         MatteCore_DoFringeFlt(nullptr, flt.Get(), nullptr, 2, 0.5, 0, 0),
                         MatteCore_DoInvert(nullptr, flt.Get(), 4),
                         MatteCore_DoInFill(nullptr, flt.Get(), 0.5, -1),
                         MatteCore_DoMultiBox(nullptr, flt.Get(), 4, 2.0, 1),
                         MatteCore_DoSpill(nullptr, nullptr, {})};
    for (size_t i = 0; i < std::size(done); ++i) EXPECT_FALSE(done[i]) << "call " << i;
    // Rows not made yet, under a limit that refuses them: false, the canvas untouched.
    Ref<Image> unmade = NewImageTagList({{ImgWidth, 64}, {ImgHeight, 64}, {ImgDepth, DepthRGBAFlt32}});
    EXPECT_FALSE(UnderTightMemory([&] { return MatteCore_DoInvert(nullptr, unmade.Get()); }));
    EXPECT_EQ(unmade->GetCanvasColor(), FltPixel{});
}

TEST(MatteSteps, SpillMethodsTakeMoreFromGentlestToStrongest) {
    // Green spill of many kinds (red and blue not negative), a grey, and colours without spill.
    const FltPixel in[] = {{0.2f, 0.9f, 0.1f, 1}, {0.5f, 0.6f, 0.4f, 1}, {0.8f, 0.8f, 0.8f, 1}, {0.1f, 0.3f, 0.7f, 1},
                           {0.f, 1.f, 0.f, 1},    {1.2f, 1.5f, 0.3f, 1}, {0.4f, 0.2f, 0.6f, 1}, {0.3f, 0.3f, 0.9f, 1}};
    std::vector<float> previous(std::size(in), 1e9f);
    for (int method = SpillRare; method <= SpillBurnt; ++method)
        for (size_t i = 0; i < std::size(in); ++i) {
            Ref<Image> img = ts::PatternImage(1, 1, DepthRGBAFlt32);
            img->PutFlt(0, 0, in[i]);
            ASSERT_TRUE(MatteCore_DoSpill(nullptr, img.Get(), {1, 1.0, method}));
            const FltPixel out = img->GetFlt(0, 0);
            EXPECT_TRUE(out.G <= previous[i] && out.G <= std::max(in[i].R, in[i].B) + 1e-6f) << method << " " << i;
            EXPECT_TRUE(in[i].R != in[i].B || in[i].G > in[i].R || out.G == in[i].G) << "nothing to take " << i;
            EXPECT_TRUE(out.R == in[i].R && out.B == in[i].B && out.A == in[i].A);
            previous[i] = out.G;
        }
}

TEST(MatteSteps, SoftenReachesAsFarAsTheBlurToolsSizeSaysInTheNamedChannelOnly) {
    // Size 4 on a frame 1440 wide is 8 pixels, a Gaussian of sigma 4: the
    // impulse falls to exp(-d^2 / 32) of its peak at distance d. A mask's
    // one value is blurred whatever channel is named.
    for (const int depth : {DepthRGBAFlt32, DepthRGBAFlt16, DepthAFlt32}) {
        SCOPED_TRACE(DepthName(depth));
        Ref<Image> img = NewImageTagList({{ImgWidth, 1440}, {ImgHeight, 64}, {ImgDepth, depth}});
        ASSERT_TRUE(img->AllocScanLineData());
        img->Fill({0.25f, 0.5f, 0.75f, 0.f});
        img->PutFlt(700, 32, {0.25f, 0.5f, 0.75f, 1.f});
        ASSERT_TRUE(MatteCore_DoSoftenChannel(nullptr, img.Get(), img->IsMask() ? MatteRed : MatteAlpha, 4, 4, 4));
        const float peak = img->GetFlt(700, 32).A;
        EXPECT_NEAR(peak, 1.0 / (2 * M_PI * 16), 1e-5);
        for (const auto &[x, y] : {std::pair{704, 32}, {700, 28}, {696, 36}, {706, 31}}) {
            const FltPixel p = img->GetFlt(x, y);
            EXPECT_NEAR(p.A / peak, std::exp(-((x - 700) * (x - 700) + (y - 32) * (y - 32)) / 32.0), 1e-3);
            EXPECT_TRUE(img->IsMask() || (p.R == 0.25f && p.G == 0.5f && p.B == 0.75f)) << x << "," << y;
        }
    }
}

TEST(MatteSteps, CopyChannelTakesTheSourcesValueOrCanvasAndKeepsTheOthers) {
    struct Case {
        int srcDepth, dstDepth, from, to;
        ImgRectI srcWindow, dstWindow;
    };
    for (const Case &c : {Case{DepthRGBAFlt16, DepthRGBAFlt32, 0, 3, {-2, -1, 18, 14}, {3, 2, 13, 10}},
                          {DepthAFlt32, DepthRGBAInt8, 2, 1, {1, 5, 15, 9}, {3, 2, 13, 10}},
                          {DepthRGBAInt8, DepthAInt16, 2, 0, {5, 0, 9, 12}, {0, 3, 16, 9}}}) {
        SCOPED_TRACE(DepthName(c.srcDepth) + " into " + DepthName(c.dstDepth));
        Ref<Image> src = ts::WindowedImage(16, 12, c.srcWindow, {0.6f, 0.5f, 0.4f, 0.3f}, 8, c.srcDepth);
        Ref<Image> dst = ts::WindowedImage(16, 12, c.dstWindow, {0.2f, 0.1f, 0.9f, 0.7f}, 9, c.dstDepth);
        Ref<Image> before = CopyOfImage(dst.Get());
        ASSERT_TRUE(MatteCore_DoCopyChannel(nullptr, src.Get(), dst.Get(), c.from, c.to));
        // Beyond its window dst holds its canvas, whose channel took the source's canvas channel.
        ExpectEveryPixel(*dst, [&](int x, int y) {
            FltPixel s = c.dstWindow.Contains(x, y) ? src->GetFlt(x, y) : src->GetCanvasColor();
            FltPixel p = before->GetFlt(x, y);
            Ch(p, dst->IsMask() ? 3 : c.to) = Ch(s, src->IsMask() ? 3 : c.from); // a mask's value is its alpha
            return p;
        });
    }
}

TEST(MatteSteps, GarbageAndSolidMattesFollowTheMaskEverywhereAndWidenWhereItReachesBeyond) {
    struct Case {
        int mode;
        bool premultiplied, invert, beyond;
        float maskCanvas;
        FltPixel imgCanvas;
        bool widens;
    };
    const ImgRectI window(3, 2, 13, 10);
    const FltPixel clear{}, grey{0.2f, 0.3f, 0.1f, 0.5f}, opaque{0.1f, 0.1f, 0.1f, 1};
    const Case cases[] = {
        {GarbageMatteGarbage, true, false, false, 0.f, grey, false}, // the mask inside the window
        {GarbageMatteGarbage, true, false, true, 0.f, clear, false}, // nothing beyond to take from
        {GarbageMatteGarbage, false, true, true, 0.f, clear, true},  // inverted: its canvas covers
        {GarbageMatteGarbage, true, false, true, 0.f, grey, true},   // takes from the canvas
        {GarbageMatteSolid, false, false, false, 0.f, clear, false}, // inside
        {GarbageMatteSolid, false, false, true, 0.f, clear, true},   // makes the clear canvas solid
        {GarbageMatteSolid, true, true, true, 0.3f, grey, true},     // inverted, its canvas not clear
        {GarbageMatteSolid, false, false, true, 0.f, opaque, false}, // nothing to add to a solid canvas
    };
    for (const int depth : {DepthRGBAFlt32, DepthRGBAInt8})
        for (const Case &c : cases) {
            SCOPED_TRACE("case " + std::to_string(&c - cases) + ", " + DepthName(depth));
            const ImgRectI maskWindow = c.beyond ? ImgRectI(-2, 5, 18, 14) : ImgRectI(5, 4, 11, 8);
            Ref<Image> img = ts::WindowedImage(16, 12, window, c.imgCanvas, 4, depth), before = CopyOfImage(img.Get());
            Ref<Image> mask = ts::WindowedImage(16, 12, maskWindow, {0, 0, 0, c.maskCanvas}, 6, DepthAFlt16);
            Ref<Image> out = DoGarbageMatte(nullptr, img.Get(), mask.Get(), c.mode, c.premultiplied, c.invert);
            ASSERT_TRUE(out);
            EXPECT_EQ(out.Get() != img.Get(), c.widens);
            EXPECT_EQ(out->DataWindow(), c.widens ? (window | maskWindow) : window);
            // A pre-calculation, without pixels, gets the same window.
            Ref<Image> shape = NewImageTagList(
                {{ImgLikeImage, img.Get()}, {ImgDataWindow, &window}, {ImgNoData, 1}, {ImgCanvasColor, &c.imgCanvas}});
            Ref<Image> shapeOut = DoGarbageMatte(nullptr, shape.Get(), mask.Get(), c.mode, c.premultiplied, c.invert);
            EXPECT_TRUE(shapeOut && shapeOut->IsNoData() && shapeOut->DataWindow() == out->DataWindow());
            auto model = [&](FltPixel p, float m) {
                m = c.invert ? 1 - std::clamp(m, 0.f, 1.f) : std::clamp(m, 0.f, 1.f);
                if (c.mode == GarbageMatteSolid) return FltPixel{p.R, p.G, p.B, p.A + m * (1 - p.A)};
                const float k = c.premultiplied ? 1 - m : 1;
                return FltPixel{p.R * k, p.G * k, p.B * k, p.A * (1 - m)};
            };
            ExpectEveryPixel(*out, [&](int x, int y) { // new pixels of an int8 image store the canvas rounded
                FltPixel p = before->GetFlt(x, y);
                const bool stored = !window.Contains(x, y) && out->DataWindow().Contains(x, y) && !img->IsFloat();
                for (int ch = 0; ch < 4 && stored; ++ch) Ch(p, ch) = std::round(Ch(p, ch) * 255) / 255;
                return model(p, mask->GetFlt(x, y).A);
            });
            ts::ExpectPixelNear(out->GetCanvasColor(), model(c.imgCanvas, c.maskCanvas), 1e-6, "canvas");
            if (::testing::Test::HasFailure()) return;
        }
    Ref<Image> img = ts::PatternImage(4, 4, DepthRGBAFlt32), before = CopyOfImage(img.Get());
    EXPECT_EQ(DoGarbageMatte(nullptr, img.Get(), nullptr, GarbageMatteGarbage, false, false).Get(), img.Get());
    // Refused memory for the widened image: no result, the image untouched.
    Ref<Image> all = ts::WindowedImage(4, 4, {-500, -500, 500, 500}, {0, 0, 0, 1}, 2, DepthAFlt32);
    EXPECT_FALSE(
        UnderTightMemory([&] { return bool(DoGarbageMatte(nullptr, img.Get(), all.Get(), 1, false, false)); }));
    ExpectEveryPixel(*img, [&](int x, int y) { return before->GetFlt(x, y); });
}

TEST(MatteSteps, MaskInputsAddANestedMaskLinkAndSwitchAndGetMaskReadsThem) {
    Ref<Operator> tool = MakeRef<Operator>(nullptr, ScriptVal(), TagList{});
    tool->AddControlPageTagList("Controls", {});
    const MaskInputs solid(*tool, "Solid", "Solid Matte"), garbage(*tool, "Garbage", "Garbage Matte", "Matte");
    const Input *mask = tool->FindInput("Garbage.Mask"), *inverted = tool->FindInput("Garbage.MaskInverted");
    ASSERT_TRUE(mask && inverted && mask == garbage.Mask() && inverted == garbage.Inverted());
    EXPECT_TRUE(mask->DataType() == CLSID_DataType_Mask && mask->Priority() == PriorityMask && !mask->IsRequired());
    // Each nest folds exactly its two inputs; the garbage matte sits on the page it named.
    ASSERT_EQ(tool->Nests().size(), 2u);
    const ControlNest &nest = tool->Nests()[1];
    EXPECT_TRUE(nest.id == OvID("Garbage.MaskNest") && nest.name == "Garbage Matte" && inverted->Name() == "Invert");
    EXPECT_TRUE(nest.firstInput == mask->Index() && nest.endInput == inverted->Index() + 1);
    EXPECT_TRUE(tool->Pages()[mask->Page()].name == "Matte" && tool->Pages()[solid.Mask()->Page()].name == "Controls");
    Request req(tool.Get(), nullptr, 0.0, 0, nullptr);
    bool invert = true;
    EXPECT_TRUE(!garbage.GetMask(&req, &invert) && !invert) << "nothing connected, the switch at its default";
    Ref<Image> drawn = ts::PatternImage(4, 4, DepthAFlt32);
    req.SetInputData(garbage.Mask(), drawn.Get());
    req.SetInputData(garbage.Inverted(), MakeRef<Number>(1.0).Get());
    EXPECT_TRUE(garbage.GetMask(&req, &invert) == drawn.Get() && invert && !solid.GetMask(&req));
}

} // namespace
} // namespace Orvane::mattestepstest
