// The Custom tool through the engine: every output pixel against values worked
// out here from the input images, with one, two and three images, an absent
// image, setup and intermediate values, numbers, points and LUTs, samplers with
// their edge rules, clamping on integer output, auxiliary channels, regions,
// faulty expressions, and noise that does not depend on the worker count.
#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "host/color/SplineCurve.h"
#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

namespace Support = Orvane::Test;
constexpr int W = 24, H = 16;
const FltPixel kCanvas{0.1f, 0.2f, 0.3f, 0.5f};

/// A frame with images 1 to 3 (null: not linked) and a Custom tool over them.
struct CustomRig {
    OrvaneDoc doc;
    Operator *tool = nullptr;
    explicit CustomRig(const std::vector<Ref<Image>> &images) {
        Support::LoadOperators();
        tool = doc.AddTool(OvID("Custom"));
        EXPECT_TRUE(tool);
        for (size_t k = 0; k < images.size(); ++k) {
            if (!images[k]) continue;
            const std::string name = "Src" + std::to_string(k + 1);
            auto *src = Support::AddImageSource(doc, name, images[k]);
            EXPECT_TRUE(tool->FindInput(("Image" + std::to_string(k + 1)).c_str())->ConnectTo(src->FindMainOutput()));
        }
    }
    Ref<Image> Render(const ImgRectI *roi = nullptr) {
        RenderTask task;
        EvalOptions opt;
        opt.task = &task, opt.useCache = false;
        if (roi) opt.roi = ImageDomain(*roi);
        return Support::EvalImage(tool, 1.0, opt);
    }
};

using PixelFn = std::function<FltPixel(int x, int y)>;

void ExpectEveryPixel(const Image &out, const ImgRectI &over, const PixelFn &want, double tol,
                      const std::string &what) {
    int bad = 0;
    for (int y = over.y0; y < over.y1; ++y)
        for (int x = over.x0; x < over.x1 && bad < 3; ++x) {
            const FltPixel got = out.GetFlt(x, y), w = want(x, y);
            const bool near = std::abs(got.R - w.R) <= tol && std::abs(got.G - w.G) <= tol &&
                              std::abs(got.B - w.B) <= tol && std::abs(got.A - w.A) <= tol;
            if (!near) {
                ++bad;
                ADD_FAILURE() << what << " at " << x << "," << y << ": got " << got.R << " " << got.G << " " << got.B
                              << " " << got.A << ", want " << w.R << " " << w.G << " " << w.B << " " << w.A;
            }
        }
}

TEST(Custom, PixelsFollowTheExpressions) {
    const Ref<Image> one = Support::WindowedImage(W, H, ImgRectI(4, 2, 20, 14), kCanvas, 1);
    const Ref<Image> two = Support::PatternImage(W, H, DepthRGBAFlt32, 2);
    const Ref<Image> three = Support::PatternImage(W, H, DepthRGBAFlt32, 3);
    auto p1 = [&](int x, int y) { return one->GetFlt(x, y); };
    auto p2 = [&](int x, int y) { return two->GetFlt(x, y); };
    auto p3 = [&](int x, int y) { return three->GetFlt(x, y); };
    auto f = [](double v) { return static_cast<float>(v); };
    struct Case {
        const char *what;
        std::vector<Ref<Image>> images;
        std::map<std::string, std::string> texts;
        std::vector<std::pair<const char *, double>> numbers;
        PixelFn want;
    };
    const Case cases[] = {
        {"the defaults copy image 1, its canvas outside its window", {one}, {}, {}, p1},
        {"a grade",
         {one},
         {{"RedExpression", "r1*1.2+0.01"}, {"GreenExpression", "g1 - 0.5"}, {"BlueExpression", "-b1"}},
         {},
         [&](int x, int y) {
             const FltPixel a = p1(x, y);
             return FltPixel{f(a.R * 1.2 + 0.01), f(a.G - 0.5), -a.B, a.A};
         }},
        {"two plates mixed by alpha, and the current channel",
         {one, two},
         {{"RedExpression", "r1 * (1 - a2) + r2"}, {"GreenExpression", "c2"}, {"BlueExpression", "if(b1 > b2, 1, 0)"}},
         {},
         [&](int x, int y) {
             const FltPixel a = p1(x, y), b = p2(x, y);
             return FltPixel{f(a.R * (1.0 - b.A) + b.R), b.G, a.B > b.B ? 1.f : 0.f, a.A};
         }},
        {"three images, position and sizes",
         {one, two, three},
         {{"RedExpression", "r1 + r2 - r3"},
          {"GreenExpression", "x"},
          {"BlueExpression", "y"},
          {"AlphaExpression", "w1 + h3 / 100"}},
         {},
         [&](int x, int y) {
             return FltPixel{f(double(p1(x, y).R) + p2(x, y).R - p3(x, y).R), f(double(x) / W), f(double(y) / H),
                             f(W + H / 100.0)};
         }},
        {"image 1 absent: zero channels and sizes",
         {nullptr, two},
         {{"GreenExpression", "g2"}, {"AlphaExpression", "w1 + h1 + w2"}},
         {},
         [&](int x, int y) {
             return FltPixel{0, p2(x, y).G, 0, f(W)};
         }},
        {"setup, intermediates and numbers, one by its name",
         {one},
         {{"Setup1", "n1 * 2"},
          {"Intermediate1", "r1 + s1"},
          {"RedExpression", "i1 * 2"},
          {"NameforNumber2", "depth"},
          {"AlphaExpression", "depth"}},
         {{"NumberIn1", 0.25}, {"NumberIn2", -3}},
         [&](int x, int y) {
             const FltPixel a = p1(x, y);
             return FltPixel{f((a.R + 0.5) * 2), a.G, a.B, -3};
         }},
        {"samplers with black, wrap and duplicate edges",
         {one, two},
         {{"RedExpression", "getr2b(x + 1/w, y)"},
          {"GreenExpression", "getg2w(x - 1/w, y)"},
          {"BlueExpression", "getb2d(x, y + 2/h)"}},
         {},
         [&](int x, int y) {
             return FltPixel{x + 1 < W ? p2(x + 1, y).R : 0.f, p2((x + W - 1) % W, y).G,
                             p2(x, std::min(y + 2, H - 1)).B, p1(x, y).A};
         }},
    };
    for (const Case &c : cases) {
        CustomRig rig(c.images);
        for (const auto &[id, text] : c.texts) Support::SetText(rig.tool, id.c_str(), text);
        Support::SetNumbers(rig.tool, c.numbers);
        const Ref<Image> out = rig.Render();
        ASSERT_TRUE(out) << c.what << "\n" << Support::ConsoleText(rig.doc);
        EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, W, H)) << c.what;
        ExpectEveryPixel(*out, out->DataWindow(), c.want, 2e-6, c.what);
    }
}

TEST(Custom, PointsLutsRegionsAndFaultyExpressions) {
    const Ref<Image> one = Support::PatternImage(W, H, DepthRGBAFlt32, 4);
    CustomRig rig({one});
    Support::SetPoint(rig.tool, "PointIn2", 0.25, -2);
    rig.tool->FindInput("LUTIn1")->SetValue(MakeRef<SplineCurve>(std::vector<CurvePoint>{{0, 0}, {1, 2}}));
    Support::SetText(rig.tool, "RedExpression", "p2x + p2y");
    Support::SetText(rig.tool, "GreenExpression", "lut1(1.5) + lut1(-1)"); // clamped to the curve's ends: 2 + 0
    Support::SetText(rig.tool, "BlueExpression", "b1 +");                  // does not parse: 0
    const ImgRectI roi(3, 5, 11, 9);
    const Ref<Image> out = rig.Render(&roi);
    ASSERT_TRUE(out);
    EXPECT_EQ(out->DataWindow(), roi);
    ExpectEveryPixel(
        *out, roi,
        [&](int x, int y) {
            return FltPixel{-1.75f, 2, 0, one->GetFlt(x, y).A};
        },
        1e-6, "points, LUT and a faulty expression");
    EXPECT_NE(Support::ConsoleText(rig.doc).find("CT1: Blue expression, column 5"), std::string::npos)
        << Support::ConsoleText(rig.doc);
}

TEST(Custom, IntegerOutputClampsAndAuxiliaryChannelsFollow) {
    const Ref<Image> eight = Support::PatternImage(W, H, DepthRGBAInt8, 5);
    CustomRig rig({eight});
    Support::SetText(rig.tool, "RedExpression", "r1 * 4 - 1");
    Support::SetText(rig.tool, "GreenExpression", "-1");
    const Ref<Image> out = rig.Render();
    ASSERT_TRUE(out);
    EXPECT_EQ(out->Depth(), DepthRGBAInt8);
    ExpectEveryPixel(
        *out, out->DataWindow(),
        [&](int x, int y) {
            const FltPixel a = eight->GetFlt(x, y);
            return FltPixel{std::clamp(a.R * 4 - 1, 0.f, 1.f), 0, a.B, a.A};
        },
        0.5 / 255 + 1e-6, "8-bit output");

    // A proxy at half size (full width 2 W, proxy factor 0.5): what an expression writes to a vector channel is
    // divided by the factor, so "vx1 + 1" gives (v + 1) * 2.
    Ref<Image> withZ = Support::PatternImage(W, H, DepthRGBAFlt32, 6);
    withZ->SetAttrsTagList({{ImgFullWidth, 2 * W}, {ImgFullHeight, 2 * H}});
    ASSERT_TRUE(withZ->AddAuxChannel(AuxChannelKind::Z) && withZ->AddAuxChannel(AuxChannelKind::VectorX));
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) {
            withZ->AuxRow(AuxChannelKind::Z, y)[x] = float(x * 100 + y);
            withZ->AuxRow(AuxChannelKind::VectorX, y)[x] = float(x - y);
        }
    CustomRig aux({withZ});
    Support::SetText(aux.tool, "ZExpression", "z1 * 2 + getz1b(x + 1/w, y)");
    Support::SetText(aux.tool, "XVectorExpression", "vx1 + 1");
    const Ref<Image> zOut = aux.Render();
    ASSERT_TRUE(zOut && zOut->HasAuxChannel(AuxChannelKind::Z) && zOut->HasAuxChannel(AuxChannelKind::VectorX));
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) {
            ASSERT_EQ(zOut->AuxRow(AuxChannelKind::Z, y)[x], 2.f * (x * 100 + y) + (x + 1 < W ? (x + 1) * 100 + y : 0))
                << x << "," << y;
            ASSERT_EQ(zOut->AuxRow(AuxChannelKind::VectorX, y)[x], (float(x - y) + 1) * 2) << x << "," << y;
        }
}

TEST(Custom, NoiseRepeatsAtAnyWorkerCountAndFollowsTheSeed) {
    const Ref<Image> one = Support::PatternImage(W, H, DepthRGBAFlt32, 7);
    auto render = [&](int workers, double seed) {
        const int before = WorkerCount();
        SetWorkerCount(workers);
        CustomRig rig({one});
        Support::SetText(rig.tool, "RedExpression", "rand()");
        Support::SetNumber(rig.tool, "RandomSeed", seed);
        Ref<Image> out = rig.Render();
        SetWorkerCount(before);
        std::vector<float> reds;
        for (int y = 0; out && y < H; ++y)
            for (int x = 0; x < W; ++x) reds.push_back(out->GetFlt(x, y).R);
        return reds;
    };
    const std::vector<float> a = render(1, 3), b = render(4, 3), c = render(1, 4);
    ASSERT_EQ(a.size(), size_t(W * H));
    EXPECT_EQ(a, b);
    EXPECT_NE(a, c);
    const auto [lo, hi] = std::minmax_element(a.begin(), a.end());
    EXPECT_GE(*lo, 0.f);
    EXPECT_LT(*hi, 1.f);
    EXPECT_GT(*hi - *lo, 0.5f); // spread over the range, not one value
}

} // namespace
} // namespace Orvane
