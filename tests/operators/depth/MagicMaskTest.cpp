// The Magic Mask tool against a provider of the object-mask kernel made here: a colour-distance matte (the mean
// colour under the positive strokes against the mean under the negative ones), so every expected matte is worked
// out from the plate alone. Covers the parameter block the tool fills, the skip rules, the strokes' document form,
// a failing or absent provider, the matte page, and tracking runs (propagation, the processed span, run ends).
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "host/flow/ControlCommand.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Link.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/krom/KernelProvider.h"
#include "operators/depth/MagicMaskStrokes.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

namespace T = Orvane::Test;

const OvID kStrokesType("MagicMaskStrokes");
constexpr int kW = 16, kH = 4;

/// What one call of the kernel was given.
struct SeenCall {
    OrvaneSemanticSegmentationParams block;
    std::vector<float> pos, neg;
    ImgRectI propWindow;
};

/// alpha = dNeg / (dNeg + dPos), d the RGB distance to the mean colour under each list of strokes.
struct ColourDistanceProvider : KernelProvider {
    std::mutex lock;
    std::vector<SeenCall> calls;
    int purges = 0;
    bool fail = false;

    const char *Name() const override { return "colour distance (test)"; }
    void Purge() override { ++purges; }

    static bool MeanUnder(const Image &src, const std::vector<float> &list, FltPixel &mean) {
        double sum[3] = {0, 0, 0};
        int n = 0;
        for (size_t i = 0; i + 1 < list.size(); i += 2) {
            if (std::isnan(list[i])) continue;
            const FltPixel p =
                src.GetFlt(static_cast<int>(std::floor(list[i])), static_cast<int>(std::floor(list[i + 1])));
            sum[0] += p.R, sum[1] += p.G, sum[2] += p.B, ++n;
        }
        if (n) mean = {float(sum[0] / n), float(sum[1] / n), float(sum[2] / n), 1.f};
        return n > 0;
    }

    bool Run(const ProviderCall &call, std::string &error) override {
        std::lock_guard guard(lock);
        if (fail) return error = "the test provider is told to fail", false;
        SeenCall seen;
        seen.block = *static_cast<const OrvaneSemanticSegmentationParams *>(call.block);
        seen.pos = call.floatLists.at("posStroke");
        seen.neg = call.floatLists.at("negStroke");
        const Image &src = *call.inputs.at("src");
        seen.propWindow = call.inputs.at("cachePropMaskIn")->DataWindow();
        calls.push_back(seen);
        FltPixel pos{}, neg{};
        const bool hasPos = MeanUnder(src, seen.pos, pos), hasNeg = MeanUnder(src, seen.neg, neg);
        Image &dst = *call.outputs.at("dst"), &prop = *call.outputs.at("cachePropMaskOut");
        const ImgRectI dw = src.DataWindow();
        for (int y = dw.y0; y < dw.y1; ++y)
            for (int x = dw.x0; x < dw.x1; ++x) {
                const FltPixel p = src.GetFlt(x, y);
                auto dist = [&p](const FltPixel &m) { return std::hypot(p.R - m.R, p.G - m.G, p.B - m.B); };
                const double dp = hasPos ? dist(pos) : 1.0, dn = hasNeg ? dist(neg) : 1.0;
                const float a = !hasPos ? 0.f : dp + dn > 0 ? float(dn / (dp + dn)) : 1.f;
                dst.PutFlt(x, y, {a, a, a, a});
                prop.PutFlt(x, y, {a, a, a, a});
            }
        return true;
    }
};

/// A grey ramp: v = x / 15 in red, green and blue, alpha 1.
Ref<Image> Ramp(const ImgRectI *window = nullptr) {
    const ImgRectI full(0, 0, kW, kH);
    Ref<Image> img = NewImageTagList(
        {{ImgWidth, kW}, {ImgHeight, kH}, {ImgDepth, DepthRGBAFlt32}, {ImgDataWindow, window ? window : &full}});
    EXPECT_TRUE(img->AllocScanLineData());
    const ImgRectI dw = img->DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const float v = x / 15.f;
            img->PutFlt(x, y, {v, v, v, 1.f});
        }
    return img;
}

ScriptVal StrokeList(const std::vector<std::vector<double>> &strokes) {
    ScriptVal list = ScriptVal::Table();
    for (const auto &s : strokes) {
        ScriptVal points = ScriptVal::Table();
        for (double v : s) points.Append(ScriptVal(v));
        list.Append(std::move(points));
    }
    return list;
}

Ref<Parameter> Strokes(const std::vector<std::vector<double>> &pos, const std::vector<std::vector<double>> &neg) {
    ScriptVal v = ScriptVal::Table();
    v.Set("PosStrokes", StrokeList(pos));
    v.Set("NegStrokes", StrokeList(neg));
    return ParameterFromScript(kStrokesType, v);
}

/// A positive stroke over the ramp's right column, a negative one over its left: the matte is then the ramp itself.
Ref<Parameter> RampStrokes() { return Strokes({{15.5 / kW, 0.5 / kH, 15.5 / kW, 2.5 / kH}}, {{0.5 / kW, 1.5 / kH}}); }

class MagicMaskTest : public ::testing::Test {
protected:
    void SetUp() override {
        T::LoadOperators();
        RegisterKernelProvider("GetObjectMask", provider);
        doc.SetRenderRange(0, 10);
    }
    void TearDown() override { UnregisterKernelProvider("GetObjectMask", provider.get()); }

    Operator *AddMask(Ref<Image> plate, TagList tags = {}) { return AddMaskTo(doc, std::move(plate), std::move(tags)); }
    Operator *AddMaskTo(OrvaneDoc &d, Ref<Image> plate, TagList tags = {}) {
        src = T::AddImageSource(d, "Src" + std::to_string(d.Tools().size()), std::move(plate));
        const Registry *row = ClassRegistry->Find(OvID("MagicMask"));
        EXPECT_NE(row, nullptr);
        Ref<Operator> op = Ref<Operator>::Adopt(dynamic_cast<Operator *>(row->New(ScriptVal(), tags)));
        EXPECT_TRUE(op && d.AddTool(op.Get(), d.FindTool("Mask") ? "Mask2" : "Mask"));
        EXPECT_TRUE(op->FindInput("Input")->ConnectTo(src->Out()));
        return op.Get();
    }
    static void SetStrokes(Operator *op, Ref<Parameter> strokes) {
        ASSERT_TRUE(strokes);
        ASSERT_TRUE(op->FindInput("Strokes")->SetValue(std::move(strokes)));
    }
    static Ref<Image> Render(Operator *op, double time) {
        EvalOptions options;
        options.useCache = false;
        return T::EvalImage(op, time, options);
    }
    bool Track(Operator *op, double from, double to, RenderTask &task) {
        return op->ControlCommand(
            CCMD_Track,
            {{CCMD_TrackFrom, from}, {CCMD_TrackTo, to}, {CCMD_TrackTask, static_cast<const void *>(&task)}});
    }
    static double Value(Operator *op, const char *id) {
        return dynamic_cast<const Number *>(op->FindInput(id)->Constant().Get())->value;
    }

    std::shared_ptr<ColourDistanceProvider> provider = std::make_shared<ColourDistanceProvider>();
    OrvaneDoc doc;
    T::ImageSourceTool *src = nullptr;
};

TEST_F(MagicMaskTest, FillsTheParameterBlockAndHandsTheStrokesOverInPixels) {
    Operator *op = AddMask(Ramp(), {{0x1000012c, 3}});
    Operator *other = AddMask(Ramp()); // a second tool: another operator ID, the default algorithm version
    SetStrokes(op, RampStrokes());
    T::SetNumbers(op, {{"Mode", 1}, {"RefineRange", 12}, {"ReferenceTime", 4}});
    ASSERT_TRUE(Render(op, 4.75));
    ASSERT_TRUE(Render(op, 6.0));
    SetStrokes(op, Strokes({}, {}));
    ASSERT_TRUE(Render(op, 4.0));
    other->FindInput("Input")->ConnectTo(src->Out());
    ASSERT_TRUE(Render(other, 0.0));
    ASSERT_EQ(provider->calls.size(), 4u);
    const struct {
        int timeStamp, refFrame, keyFrame, better, refine, algo;
    } want[] = {{4, 1, 1, 1, 12, 3}, {6, 0, 1, 1, 12, 3}, {4, 1, 0, 1, 12, 3}, {0, 1, 0, 0, 30, 1}};
    for (size_t i = 0; i < 4; ++i) {
        const OrvaneSemanticSegmentationParams &p = provider->calls[i].block;
        SCOPED_TRACE(i);
        EXPECT_EQ(p.compId, reinterpret_cast<uintptr_t>(&doc));
        EXPECT_EQ(p.timeStamp, want[i].timeStamp);
        EXPECT_EQ(p.isRefframe, want[i].refFrame);
        EXPECT_EQ(p.isKeyframe, want[i].keyFrame);
        EXPECT_EQ(p.isBetterMode, want[i].better);
        EXPECT_EQ(p.refineRange, want[i].refine);
        EXPECT_EQ(p.algoVer, want[i].algo);
        EXPECT_EQ(p.isSrcPreMult, 1);
        EXPECT_EQ(p.isTracking, 0);
        EXPECT_EQ(p.hasCachePropMask, 0);
        EXPECT_EQ(provider->calls[i].propWindow, ImgRectI(0, 0, 1, 1)); // the dummy
    }
    EXPECT_EQ(provider->calls[0].block.operatorId, provider->calls[1].block.operatorId);
    EXPECT_NE(provider->calls[0].block.operatorId, provider->calls[3].block.operatorId);
    // Frame fractions times the frame's size, each stroke closed by a pair of NaNs.
    const std::vector<float> pos = provider->calls[0].pos, neg = provider->calls[0].neg;
    ASSERT_EQ(pos.size(), 6u);
    EXPECT_FLOAT_EQ(pos[0], 15.5f);
    EXPECT_FLOAT_EQ(pos[1], 0.5f);
    EXPECT_FLOAT_EQ(pos[3], 2.5f);
    EXPECT_TRUE(std::isnan(pos[4]) && std::isnan(pos[5]));
    ASSERT_EQ(neg.size(), 4u);
    EXPECT_FLOAT_EQ(neg[0], 0.5f);
    EXPECT_FLOAT_EQ(neg[1], 1.5f);
    EXPECT_TRUE(provider->calls[2].pos.empty() && provider->calls[2].neg.empty());

    // Strokes keyed on frames: only a frame with a key of its own is a keyframe.
    AnimCurve curve;
    curve.SetKey(2, RampStrokes(), KeyInterp::Hold);
    ASSERT_TRUE(op->FindInput("Strokes")->SetCurve(curve));
    ASSERT_TRUE(Render(op, 2.0) && Render(op, 3.0));
    EXPECT_EQ(provider->calls[4].block.isKeyframe, 1);
    EXPECT_EQ(provider->calls[5].block.isKeyframe, 0);
}

TEST_F(MagicMaskTest, APreCalculationDoesNotRunTheKernel) {
    // Windows only: the image has no pixels, so the core step leaves it alone.
    Operator *op = AddMask(Ramp());
    SetStrokes(op, RampStrokes());
    EvalOptions precalc;
    precalc.flags = ReqFlagPreCalc;
    precalc.useCache = false;
    EXPECT_TRUE(Evaluate(op->FindMainOutput(), 0.0, precalc));
    EXPECT_TRUE(provider->calls.empty());
}

TEST_F(MagicMaskTest, StrokesSurviveADocumentAndCopiesAreDeep) {
    Operator *op = AddMask(Ramp());
    Ref<Parameter> strokes = Strokes({{0.1, 0.2, 0.3, 0.4, 0.5, 0.6}, {0.25, 0.75}}, {{0.9, 0.1, 0.8, 0.2}});
    SetStrokes(op, strokes);
    OrvaneDoc loaded;
    const DocumentLoadResult result = LoadDocument(SaveDocument(doc), loaded);
    ASSERT_TRUE(loaded.FindTool("Mask"));
    const Ref<Parameter> back = loaded.FindTool("Mask")->FindInput("Strokes")->Constant();
    ASSERT_TRUE(back);
    EXPECT_TRUE(back->Equals(*strokes)) << back->ToScript().ToText();
    EXPECT_EQ(back->Hash(), strokes->Hash());

    Ref<Parameter> copy = strokes->Copy();
    ASSERT_EQ(copy->DataType(), kStrokesType);
    static_cast<MagicMaskStrokes *>(copy.Get())->pos[0][1] = 0.5;
    EXPECT_FALSE(copy->Equals(*strokes));
    EXPECT_DOUBLE_EQ(static_cast<const MagicMaskStrokes *>(strokes.Get())->pos[0][1], 0.2);

    // Forms that are not strokes are refused.
    const char *const bad[] = {"{ PosStrokes = { { 0.1, 0.2, 0.3 } } }", "{ PosStrokes = { { 0.1, \"a\" } } }",
                               "{ NegStrokes = { 0.5 } }", "{ PosStrokes = 3 }", "\"strokes\""};
    for (const char *text : bad) {
        OrvaneDoc d;
        const std::string flow =
            "Orvane.Document { Tools = { M = MagicMask { Inputs = { Strokes = " + std::string(text) + " } } } }";
        LoadDocument(flow, d);
        const Operator *m = d.FindTool("M");
        EXPECT_TRUE(!m || !m->FindInput("Strokes")->Constant()) << text;
    }
}

TEST_F(MagicMaskTest, AFailingOrMissingProviderGivesTheToolsLineAndNoImage) {
    Operator *op = AddMask(Ramp());
    SetStrokes(op, RampStrokes());
    provider->fail = true;
    EXPECT_FALSE(Render(op, 0.0));
    EXPECT_NE(T::ConsoleText(doc).find("Mask: the kernel \"GetObjectMask\" failed: the test provider is told to fail"),
              std::string::npos)
        << T::ConsoleText(doc);
    UnregisterKernelProvider("GetObjectMask", provider.get());
    if (!FindKernelProvider("GetObjectMask")) {
        doc.ClearConsole();
        EXPECT_FALSE(Render(op, 0.0));
        EXPECT_EQ(T::ConsoleText(doc).rfind("error: Mask: no provider", 0), 0u) << T::ConsoleText(doc);
    }
}

TEST_F(MagicMaskTest, TheMattePageWorksOnTheKernelsMatte) {
    // The ramp's matte is v itself; each row: the settings, then alpha and red as functions of v (and x).
    const auto clamp01 = [](double a) { return std::clamp(a, 0.0, 1.0); };
    const struct {
        const char *name;
        std::vector<std::pair<const char *, double>> settings;
        std::function<double(double, int)> alpha, red;
    } cases[] = {
        {"post-multiplied by default", {}, [](double v, int) { return v; }, [](double v, int) { return v * v; }},
        {"straight colour",
         {{"PostMultiplyImage", 0}},
         [](double v, int) { return v; },
         [](double v, int) { return v; }},
        {"inverted",
         {{"InvertMatte", 1}},
         [](double v, int) { return 1 - v; },
         [](double v, int) { return v * (1 - v); }},
        {"gamma 2",
         {{"MatteGamma", 2}, {"PostMultiplyImage", 0}},
         [](double v, int) { return std::sqrt(v); },
         [](double v, int) { return v; }},
        {"threshold 0.2..0.6",
         {{"LowMatteThreshold", 0.2}, {"High", 0.6}, {"PostMultiplyImage", 0}},
         [&](double v, int) { return clamp01((v - 0.2) / 0.4); },
         [](double v, int) { return v; }},
        {"dilated a pixel",
         {{"ErodeDilate", 1.0 / kW}, {"PostMultiplyImage", 0}},
         [](double, int x) { return std::min(x + 1, 15) / 15.0; },
         [](double v, int) { return v; }},
        {"eroded a pixel",
         {{"ErodeDilate", -1.0 / kW}, {"PostMultiplyImage", 0}},
         [](double, int x) { return std::max(x - 1, 0) / 15.0; },
         [](double v, int) { return v; }},
    };
    for (const auto &c : cases) {
        OrvaneDoc local;
        Operator *op = AddMaskTo(local, Ramp());
        SetStrokes(op, RampStrokes());
        T::SetNumbers(op, c.settings);
        Ref<Image> out = Render(op, 0.0);
        ASSERT_TRUE(out) << c.name << ": " << T::ConsoleText(local);
        for (int x = 0; x < kW; ++x) {
            const double v = x / 15.0;
            const FltPixel p = out->GetFlt(x, 1);
            EXPECT_NEAR(p.A, c.alpha(v, x), 1e-5) << c.name << " x " << x;
            EXPECT_NEAR(p.R, c.red(v, x), 1e-5) << c.name << " x " << x;
        }
    }
}

TEST_F(MagicMaskTest, RunsPropagateFrameToFrameAndRecordWhatTheyCovered) {
    Operator *op = AddMask(Ramp());
    SetStrokes(op, RampStrokes());
    RenderTask task;
    // Forward 2 to 5: the first frame is the reference, each later one gets the mask of the one before.
    ASSERT_TRUE(Track(op, 2, 5, task)) << T::ConsoleText(doc);
    // Reverse 8 to 6: a new run (the last ended short of the render end).
    ASSERT_TRUE(Track(op, 8, 6, task)) << T::ConsoleText(doc);
    const int wantTimes[] = {2, 3, 4, 5, 8, 7, 6};
    ASSERT_EQ(provider->calls.size(), 7u);
    for (size_t i = 0; i < 7; ++i) {
        const OrvaneSemanticSegmentationParams &p = provider->calls[i].block;
        const bool first = i == 0 || i == 4;
        EXPECT_EQ(p.timeStamp, wantTimes[i]) << i;
        EXPECT_EQ(p.isTracking, 1) << i;
        EXPECT_EQ(p.hasCachePropMask, first ? 0 : 1) << i;
        EXPECT_EQ(p.isRefframe, first ? 1 : 0) << i;
        EXPECT_EQ(provider->calls[i].propWindow, first ? ImgRectI(0, 0, 1, 1) : ImgRectI(0, 0, kW, kH)) << i;
    }
    EXPECT_EQ(Value(op, "ReferenceTime"), 8.0);
    EXPECT_EQ(Value(op, "ProcessedFramesLow"), 2.0);
    EXPECT_EQ(Value(op, "ProcessedFramesHigh"), 8.0);
    EXPECT_EQ(provider->purges, 2); // each run ended with its leg

    // A tracked frame renders from the run's matte; another frame, or other strokes, run the kernel afresh.
    Ref<Image> tracked = Render(op, 3.0);
    ASSERT_TRUE(tracked);
    EXPECT_EQ(provider->calls.size(), 7u);
    EXPECT_NEAR(tracked->GetFlt(6, 0).A, 6 / 15.0, 1e-6);
    ASSERT_TRUE(Render(op, 9.0));
    ASSERT_EQ(provider->calls.size(), 8u);
    EXPECT_EQ(provider->calls[7].block.isTracking, 0);
    SetStrokes(op, Strokes({{0.5, 0.5}}, {}));
    ASSERT_TRUE(Render(op, 3.0));
    EXPECT_EQ(provider->calls.size(), 9u);
}

TEST_F(MagicMaskTest, AForwardLegThatReachesTheEndStaysOpenOnceForAReverseLeg) {
    Operator *op = AddMask(Ramp());
    SetStrokes(op, RampStrokes());
    RenderTask task;
    // Each row: a leg, then the purges seen and whether the following render still belongs to a run.
    ASSERT_TRUE(Track(op, 8, 10, task)); // forward to the render end: kind 4 turns to 0, the run stays
    EXPECT_EQ(provider->purges, 0);
    ASSERT_TRUE(Track(op, 8, 7, task)); // its reverse leg: same run, same reference, then it ends
    EXPECT_EQ(provider->purges, 1);
    EXPECT_EQ(Value(op, "ReferenceTime"), 8.0);
    EXPECT_EQ(provider->calls[3].block.isRefframe, 1); // frame 8 again, as the reverse leg's start
    EXPECT_EQ(provider->calls[3].block.hasCachePropMask, 0);
    op->OnEndRender(); // no run: nothing more
    EXPECT_EQ(provider->purges, 1);

    ASSERT_TRUE(Track(op, 9, 10, task)); // open again after reaching the end ...
    EXPECT_EQ(provider->purges, 1);
    op->OnEndRender(); // ... until the caller's render ends
    EXPECT_EQ(provider->purges, 2);
    op->OnEndRender();
    EXPECT_EQ(provider->purges, 2);
    ASSERT_TRUE(Render(op, 3.0)); // a frame no run covered
    EXPECT_EQ(provider->calls.back().block.timeStamp, 3);
    EXPECT_EQ(provider->calls.back().block.isTracking, 0);
}

} // namespace
} // namespace Orvane
