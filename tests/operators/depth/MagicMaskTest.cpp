// The Magic Mask tool against a provider of the object-mask kernel made here: a colour-distance matte (the mean
// colour under the positive strokes against the mean under the negative ones), so every expected matte is worked
// out from the plate alone. Covers the parameter block, the strokes' document form, a failing or absent provider,
// the matte page, tracking runs (propagation, the processed span, run ends), the disk cache of tracked mattes and
// the stroke buttons.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <tuple>
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
constexpr int kW = 16, kH = 4;
const ImgRectI kDummy(0, 0, 1, 1), kFull(0, 0, kW, kH);

/// alpha = dNeg / (dNeg + dPos), d the RGB distance to the mean colour under each list of strokes.
struct ColourDistanceProvider : KernelProvider {
    struct Seen {
        OrvaneSemanticSegmentationParams block;
        std::vector<float> pos, neg;
        ImgRectI propWindow;
    };
    std::mutex lock;
    std::vector<Seen> calls;
    int purges = 0;
    bool fail = false;

    const char *Name() const override { return "colour distance (test)"; }
    void Purge() override { ++purges; }
    static bool MeanUnder(const Image &src, const std::vector<float> &list, FltPixel &mean) {
        int n = 0;
        mean = {};
        for (size_t i = 0; i + 1 < list.size(); i += 2)
            if (!std::isnan(list[i])) {
                const FltPixel p = src.GetFlt(int(std::floor(list[i])), int(std::floor(list[i + 1])));
                mean.R += p.R, mean.G += p.G, mean.B += p.B, ++n;
            }
        if (n) mean.R /= n, mean.G /= n, mean.B /= n;
        return n > 0;
    }
    bool Run(const ProviderCall &call, std::string &error) override {
        std::lock_guard guard(lock);
        if (fail) return error = "the test provider is told to fail", false;
        const Image &src = *call.inputs.at("src");
        calls.push_back({*static_cast<const OrvaneSemanticSegmentationParams *>(call.block),
                         call.floatLists.at("posStroke"), call.floatLists.at("negStroke"),
                         call.inputs.at("cachePropMaskIn")->DataWindow()});
        FltPixel pos, neg;
        const bool hasPos = MeanUnder(src, calls.back().pos, pos), hasNeg = MeanUnder(src, calls.back().neg, neg);
        const ImgRectI dw = src.DataWindow();
        for (int y = dw.y0; y < dw.y1; ++y)
            for (int x = dw.x0; x < dw.x1; ++x) {
                const FltPixel p = src.GetFlt(x, y);
                auto dist = [&p](const FltPixel &m) { return std::hypot(p.R - m.R, p.G - m.G, p.B - m.B); };
                const double dp = hasPos ? dist(pos) : 1.0, dn = hasNeg ? dist(neg) : 1.0;
                const float a = !hasPos ? 0.f : dp + dn > 0 ? float(dn / (dp + dn)) : 1.f;
                for (const char *out : {"dst", "cachePropMaskOut"}) call.outputs.at(out)->PutFlt(x, y, {a, a, a, a});
            }
        return true;
    }
};

/// A grey ramp: v = x / 15 in red, green and blue, alpha 1.
Ref<Image> Ramp() {
    Ref<Image> img = NewImageTagList({{ImgWidth, kW}, {ImgHeight, kH}, {ImgDepth, DepthRGBAFlt32}});
    EXPECT_TRUE(img->AllocScanLineData());
    for (int y = 0; y < kH; ++y)
        for (int x = 0; x < kW; ++x) img->PutFlt(x, y, {x / 15.f, x / 15.f, x / 15.f, 1.f});
    return img;
}

using StrokeList = std::vector<std::vector<double>>;
Ref<Parameter> Strokes(const StrokeList &pos, const StrokeList &neg) {
    ScriptVal v = ScriptVal::Table();
    for (const auto &[key, list] : {std::pair{"PosStrokes", &pos}, std::pair{"NegStrokes", &neg}}) {
        ScriptVal strokes = ScriptVal::Table();
        for (const auto &s : *list) {
            ScriptVal points = ScriptVal::Table();
            for (double p : s) points.Append(ScriptVal(p));
            strokes.Append(std::move(points));
        }
        v.Set(key, std::move(strokes));
    }
    return ParameterFromScript(OvID("MagicMaskStrokes"), v);
}

/// A positive stroke over the ramp's right column, a negative one over its left: the matte is then the ramp itself.
Ref<Parameter> RampStrokes() { return Strokes({{15.5 / kW, 0.5 / kH, 15.5 / kW, 2.5 / kH}}, {{0.5 / kW, 1.5 / kH}}); }

class MagicMaskTest : public ::testing::Test {
protected:
    void SetUp() override {
        // Every test writes its tracked mattes into a folder of its own (a user's cache must not leak in).
        if (const char *old = std::getenv(kCacheVar)) oldCache = old;
        setenv(kCacheVar, cacheDir.path.c_str(), 1);
        T::LoadOperators();
        RegisterKernelProvider("GetObjectMask", provider);
        doc.SetRenderRange(0, 10);
    }
    void TearDown() override {
        UnregisterKernelProvider("GetObjectMask", provider.get());
        unsetenv("ORVANE_MAGIC_MASK_CACHE_LIMIT");
        if (oldCache)
            setenv(kCacheVar, oldCache->c_str(), 1);
        else
            unsetenv(kCacheVar);
    }
    static constexpr const char *kCacheVar = "ORVANE_MAGIC_MASK_CACHE";
    std::vector<std::filesystem::path> CacheFiles() const {
        std::vector<std::filesystem::path> files;
        for (const auto &e : std::filesystem::directory_iterator(cacheDir.path)) files.push_back(e.path());
        return files;
    }

    /// A Magic Mask named `name` on a ramp, with the ramp's strokes and `settings`.
    Operator *AddMask(OrvaneDoc &d, const char *name = "Mask", TagList tags = {},
                      const std::vector<std::pair<const char *, double>> &settings = {}) {
        T::ImageSourceTool *src = T::AddImageSource(d, std::string(name) + "Src", Ramp());
        Ref<Operator> op =
            Ref<Operator>::Adopt(dynamic_cast<Operator *>(ClassRegistry->Find(OvID("MagicMask"))->New({}, tags)));
        EXPECT_TRUE(op && d.AddTool(op.Get(), name) && op->FindInput("Input")->ConnectTo(src->Out()));
        EXPECT_TRUE(op->FindInput("Strokes")->SetValue(RampStrokes()));
        T::SetNumbers(op.Get(), settings);
        return op.Get();
    }
    static Ref<Image> Render(Operator *op, double time) {
        EvalOptions options;
        options.useCache = false;
        return T::EvalImage(op, time, options);
    }
    static bool Track(Operator *op, double from, double to, RenderTask &task) {
        return op->ControlCommand(
            CCMD_Track,
            {{CCMD_TrackFrom, from}, {CCMD_TrackTo, to}, {CCMD_TrackTask, static_cast<const void *>(&task)}});
    }
    static double Value(Operator *op, const char *id) {
        return dynamic_cast<const Number *>(op->FindInput(id)->Constant().Get())->value;
    }
    /// The fields a call's block varies in: frame, reference frame, keyframe, better, refine, algorithm, tracking,
    /// propagated mask (and the window of the mask it was given).
    std::tuple<int, int, int, int, int, int, int, int, ImgRectI> Call(size_t i) const {
        const auto &c = provider->calls.at(i);
        const OrvaneSemanticSegmentationParams &p = c.block;
        EXPECT_EQ(p.isSrcPreMult, 1);
        EXPECT_EQ(p.compId, reinterpret_cast<uintptr_t>(&doc));
        return {p.timeStamp, p.isRefframe, p.isKeyframe,       p.isBetterMode, p.refineRange,
                p.algoVer,   p.isTracking, p.hasCachePropMask, c.propWindow};
    }

    T::TempDir cacheDir;
    std::optional<std::string> oldCache;
    std::shared_ptr<ColourDistanceProvider> provider = std::make_shared<ColourDistanceProvider>();
    OrvaneDoc doc;
};

TEST_F(MagicMaskTest, FillsTheParameterBlockAndHandsTheStrokesOverInPixels) {
    Operator *op = AddMask(doc, "Mask", {{0x1000012c, 3}}, {{"Mode", 1}, {"RefineRange", 12}, {"ReferenceTime", 4}});
    Operator *other = AddMask(doc, "Other"); // another operator number, the default algorithm version
    ASSERT_TRUE(Render(op, 4.75) && Render(op, 6.0) && Render(other, 0.0));
    op->FindInput("Strokes")->SetValue(Strokes({}, {}));
    ASSERT_TRUE(Render(op, 4.0));
    AnimCurve keyed; // strokes keyed on frame 2: only that frame is a keyframe
    keyed.SetKey(2, RampStrokes(), KeyInterp::Hold);
    ASSERT_TRUE(op->FindInput("Strokes")->SetCurve(keyed) && Render(op, 2.0) && Render(op, 3.0));
    EXPECT_EQ(Call(0), std::tuple(4, 1, 1, 1, 12, 3, 0, 0, kDummy));
    EXPECT_EQ(Call(1), std::tuple(6, 0, 1, 1, 12, 3, 0, 0, kDummy));
    EXPECT_EQ(Call(2), std::tuple(0, 1, 1, 0, 30, 1, 0, 0, kDummy));
    EXPECT_EQ(Call(3), std::tuple(4, 1, 0, 1, 12, 3, 0, 0, kDummy)); // no strokes: no keyframe
    EXPECT_EQ(Call(4), std::tuple(2, 0, 1, 1, 12, 3, 0, 0, kDummy));
    EXPECT_EQ(Call(5), std::tuple(3, 0, 0, 1, 12, 3, 0, 0, kDummy));
    const auto &calls = provider->calls;
    EXPECT_EQ(calls[0].block.operatorId, calls[1].block.operatorId);
    EXPECT_NE(calls[0].block.operatorId, calls[2].block.operatorId);
    // Frame fractions times the frame's size, each stroke closed by a pair of NaNs.
    const std::vector<float> &pos = calls[0].pos, &neg = calls[0].neg;
    ASSERT_EQ(pos.size(), 6u);
    ASSERT_EQ(neg.size(), 4u);
    EXPECT_EQ(std::vector<float>(pos.begin(), pos.begin() + 4), std::vector<float>({15.5f, 0.5f, 15.5f, 2.5f}));
    EXPECT_EQ(std::vector<float>(neg.begin(), neg.begin() + 2), std::vector<float>({0.5f, 1.5f}));
    EXPECT_TRUE(std::isnan(pos[4]) && std::isnan(pos[5]) && std::isnan(neg[2]) && std::isnan(neg[3]));
    EXPECT_TRUE(calls[3].pos.empty() && calls[3].neg.empty());

    // A pre-calculation (windows only, no pixels) leaves the image alone: no kernel.
    EvalOptions shapeOnly;
    shapeOnly.flags = ReqFlagPreCalc;
    shapeOnly.useCache = false;
    ASSERT_TRUE(Evaluate(op->FindMainOutput(), 0.0, shapeOnly));
    EXPECT_EQ(calls.size(), 6u);
}

TEST_F(MagicMaskTest, StrokesSurviveADocumentAndCopiesAreDeep) {
    Operator *op = AddMask(doc);
    const Ref<Parameter> strokes = Strokes({{0.1, 0.2, 0.3, 0.4, 0.5, 0.6}, {0.25, 0.75}}, {{0.9, 0.1, 0.8, 0.2}});
    op->FindInput("Strokes")->SetValue(strokes);
    OrvaneDoc loaded;
    LoadDocument(SaveDocument(doc), loaded);
    ASSERT_TRUE(loaded.FindTool("Mask"));
    const Ref<Parameter> back = loaded.FindTool("Mask")->FindInput("Strokes")->Constant();
    ASSERT_TRUE(back && back->Equals(*strokes)) << (back ? back->ToScript().ToText() : "none");
    EXPECT_EQ(back->Hash(), strokes->Hash());

    Ref<Parameter> copy = strokes->Copy();
    static_cast<MagicMaskStrokes *>(copy.Get())->pos[0][1] = 0.5;
    EXPECT_FALSE(copy->Equals(*strokes));
    EXPECT_EQ(static_cast<const MagicMaskStrokes *>(strokes.Get())->pos[0][1], 0.2);

    for (const char *bad : {"{ PosStrokes = { { 0.1, 0.2, 0.3 } } }", "{ PosStrokes = { { 0.1, \"a\" } } }",
                            "{ NegStrokes = { 0.5 } }", "{ PosStrokes = 3 }", "\"strokes\""}) {
        OrvaneDoc d;
        LoadDocument(
            "Orvane.Document { Tools = { M = MagicMask { Inputs = { Strokes = " + std::string(bad) + " } } } }", d);
        EXPECT_TRUE(d.FindTool("M") && !d.FindTool("M")->FindInput("Strokes")->Constant()) << bad;
    }
}

TEST_F(MagicMaskTest, AFailingOrMissingProviderGivesTheToolsLineAndNoImage) {
    Operator *op = AddMask(doc);
    provider->fail = true;
    EXPECT_FALSE(Render(op, 0.0));
    EXPECT_EQ(T::ConsoleText(doc),
              "error: Mask: the kernel \"GetObjectMask\" failed: the test provider is told to fail\n");
    UnregisterKernelProvider("GetObjectMask", provider.get());
    if (!FindKernelProvider("GetObjectMask")) { // no other provider in this program
        doc.ClearConsole();
        EXPECT_FALSE(Render(op, 0.0));
        EXPECT_EQ(T::ConsoleText(doc), "error: Mask: no provider of the kernel \"GetObjectMask\" is registered\n");
    }
}

TEST_F(MagicMaskTest, TheMattePageWorksOnTheKernelsMatte) {
    // The ramp's matte is v = x / 15 itself. Each row: settings, then the expected alpha and red at x.
    using Expect = double (*)(int x);
    const struct {
        std::vector<std::pair<const char *, double>> settings;
        Expect alpha, red;
    } cases[] = {
        {{}, [](int x) { return x / 15.0; }, [](int x) { return x * x / 225.0; }}, // post-multiplied by default
        {{{"InvertMatte", 1}}, [](int x) { return 1 - x / 15.0; }, [](int x) { return x / 15.0 * (1 - x / 15.0); }},
        {{{"MatteGamma", 2}, {"PostMultiplyImage", 0}},
         [](int x) { return std::sqrt(x / 15.0); },
         [](int x) { return x / 15.0; }},
        {{{"LowMatteThreshold", 0.2}, {"High", 0.6}, {"PostMultiplyImage", 0}},
         [](int x) { return std::clamp((x / 15.0 - 0.2) / 0.4, 0.0, 1.0); },
         [](int x) { return x / 15.0; }},
        {{{"ErodeDilate", 1.0 / kW}},
         [](int x) { return std::min(x + 1, 15) / 15.0; }, // dilated a pixel
         [](int x) { return x / 15.0 * std::min(x + 1, 15) / 15.0; }},
        {{{"ErodeDilate", -1.0 / kW}},
         [](int x) { return std::max(x - 1, 0) / 15.0; }, // eroded a pixel
         [](int x) { return x / 15.0 * std::max(x - 1, 0) / 15.0; }},
        {{{"RestoreFringe", 0.01}}, // not built: the matte as it is, and a warning that says so
         [](int x) { return x / 15.0; },
         [](int x) { return x * x / 225.0; }},
    };
    for (size_t i = 0; i < std::size(cases); ++i) {
        OrvaneDoc local;
        Ref<Image> out = Render(AddMask(local, "Mask", {}, cases[i].settings), 0.0);
        ASSERT_TRUE(out) << i << ": " << T::ConsoleText(local);
        const bool fringe = i + 1 == std::size(cases);
        EXPECT_EQ(T::ConsoleText(local).find("warning: Mask: Restore Fringe is not built yet") == 0, fringe)
            << T::ConsoleText(local);
        for (int x = 0; x < kW; ++x) {
            EXPECT_NEAR(out->GetFlt(x, 1).A, cases[i].alpha(x), 1e-5) << "case " << i << " x " << x;
            EXPECT_NEAR(out->GetFlt(x, 1).R, cases[i].red(x), 1e-5) << "case " << i << " x " << x;
        }
    }
}

TEST_F(MagicMaskTest, RunsPropagateFrameToFrameAndRecordWhatTheyCovered) {
    Operator *op = AddMask(doc);
    RenderTask task;
    // Forward 2 to 5, then reverse 8 to 6 (a new run: the first ended short of the render end). A leg's first frame
    // is the reference and starts from the strokes; each later one gets the mask of the one before.
    ASSERT_TRUE(Track(op, 2, 5, task) && Track(op, 8, 6, task)) << T::ConsoleText(doc);
    const int times[] = {2, 3, 4, 5, 8, 7, 6};
    ASSERT_EQ(provider->calls.size(), 7u);
    for (size_t i = 0; i < 7; ++i) {
        const bool first = i == 0 || i == 4;
        EXPECT_EQ(Call(i), std::tuple(times[i], first, 1, 0, 30, 1, 1, !first, first ? kDummy : kFull)) << i;
    }
    EXPECT_EQ(Value(op, "ReferenceTime"), 8.0);
    EXPECT_EQ(Value(op, "ProcessedFramesLow"), 2.0);
    EXPECT_EQ(Value(op, "ProcessedFramesHigh"), 8.0);
    EXPECT_EQ(provider->purges, 2); // each run ended with its leg

    // A tracked frame renders from the run's matte; a frame outside the tracked span runs the kernel alone.
    Ref<Image> tracked = Render(op, 3.0);
    ASSERT_TRUE(tracked && provider->calls.size() == 7u);
    EXPECT_NEAR(tracked->GetFlt(6, 0).A, 6 / 15.0, 1e-6);
    ASSERT_TRUE(Render(op, 9.0));
    EXPECT_EQ(Call(7), std::tuple(9, 0, 1, 0, 30, 1, 0, 0, kDummy));
    // With other strokes the tracked span is carried again from the reference frame (8) down to the frame asked
    // for, as the run did; a render going on to the next frame carries on from there with one call.
    op->FindInput("Strokes")->SetValue(Strokes({{0.5, 0.5}}, {}));
    ASSERT_TRUE(Render(op, 3.0));
    ASSERT_EQ(provider->calls.size(), 14u);
    const int carried[] = {8, 7, 6, 5, 4, 3};
    for (size_t i = 0; i < 6; ++i) {
        EXPECT_EQ(std::get<0>(Call(8 + i)), carried[i]) << i;
        EXPECT_EQ(std::get<8>(Call(8 + i)), i == 0 ? kDummy : kFull) << i;
    }
    ASSERT_TRUE(Render(op, 2.0));
    ASSERT_EQ(provider->calls.size(), 15u);
    EXPECT_EQ(Call(14), std::tuple(2, 0, 1, 0, 30, 1, 0, 1, kFull));

    // A run whose source gives no image says so and tracks nothing.
    ASSERT_TRUE(op->FindInput("Input")->ConnectTo(T::AddImageSource(doc, "Empty", {})->Out()));
    EXPECT_FALSE(Track(op, 1, 2, task));
    EXPECT_NE(T::ConsoleText(doc).find("error: Mask: Cannot get tracking source for time 1\n"), std::string::npos)
        << T::ConsoleText(doc);
}

TEST_F(MagicMaskTest, AForwardLegThatReachesTheEndStaysOpenOnceForAReverseLeg) {
    Operator *op = AddMask(doc);
    RenderTask task;
    // Each step, then the purges so far: a forward leg to the render end (10) leaves its run open (kind 4 turns to
    // 0) for a reverse leg, whose end closes it; the caller's end of render closes one left open; no run, no purge.
    const std::function<void()> steps[] = {
        [&] { Track(op, 8, 10, task); }, [&] { Track(op, 8, 7, task); }, [&] { op->OnEndRender(); },
        [&] { Track(op, 9, 10, task); }, [&] { op->OnEndRender(); },     [&] { op->OnEndRender(); },
    };
    const int purges[] = {0, 1, 1, 1, 2, 2};
    for (size_t i = 0; i < std::size(steps); ++i) {
        steps[i]();
        EXPECT_EQ(provider->purges, purges[i]) << "step " << i;
    }
    // The reverse leg belonged to the run of frame 8: same reference, started afresh from it.
    EXPECT_EQ(Call(3), std::tuple(8, 1, 1, 0, 30, 1, 1, 0, kDummy));
    ASSERT_TRUE(Render(op, 3.0)); // a frame no run covered, after the runs
    EXPECT_EQ(Call(provider->calls.size() - 1), std::tuple(3, 0, 1, 0, 30, 1, 0, 0, kDummy));
}

TEST_F(MagicMaskTest, AnotherDocumentReadsTrackedMattesFromTheDiskCacheOnlyForTheSamePlateAndStrokes) {
    Operator *op = AddMask(doc);
    RenderTask task;
    ASSERT_TRUE(Track(op, 2, 5, task)) << T::ConsoleText(doc);
    ASSERT_EQ(CacheFiles().size(), 4u);
    const std::string saved = SaveDocument(doc);
    const Ref<Image> tracked = Render(op, 3.0);
    ASSERT_TRUE(tracked);

    // Each row: what differs in the second document (or its cache), then the kernel calls a render of frame 3
    // takes: none from the cache, else the masks carried from the reference frame (2) to 3.
    const struct {
        const char *what;
        std::function<void(OrvaneDoc &)> change;
        size_t calls;
    } cases[] = {
        {"nothing", [](OrvaneDoc &) {}, 0},
        {"one source pixel",
         [](OrvaneDoc &d) {
             Ref<Image> plate = Ramp();
             plate->PutFlt(7, 2, {0.f, 0.f, 0.f, 1.f});
             dynamic_cast<T::ImageSourceTool *>(d.FindTool("MaskSrc"))->SetImage(plate);
         },
         2},
        {"a stroke",
         [](OrvaneDoc &d) {
             d.FindTool("Mask")->FindInput("Strokes")->SetValue(Strokes({{0.9, 0.5}}, {{0.1, 0.5}}));
         },
         2},
        {"the mode",
         [](OrvaneDoc &d) {
             T::SetNumbers(d.FindTool("Mask"), {{"Mode", 1}});
         },
         2},
        {"truncated files",
         [this](OrvaneDoc &) {
             for (const auto &f : CacheFiles()) std::filesystem::resize_file(f, std::filesystem::file_size(f) - 4);
         },
         2},
        {"a foreign header of the right size",
         [this](OrvaneDoc &) {
             for (const auto &f : CacheFiles())
                 std::fstream(f, std::ios::in | std::ios::out | std::ios::binary).write("XXXX", 4);
         },
         2},
    };
    for (const auto &c : cases) {
        OrvaneDoc other;
        ASSERT_TRUE(LoadDocument(saved, other).ok) << c.what;
        dynamic_cast<T::ImageSourceTool *>(other.FindTool("MaskSrc"))->SetImage(Ramp());
        c.change(other);
        const size_t before = provider->calls.size();
        const Ref<Image> out = Render(other.FindTool("Mask"), 3.0);
        ASSERT_TRUE(out) << c.what << ": " << T::ConsoleText(other);
        EXPECT_EQ(provider->calls.size() - before, c.calls) << c.what;
        for (int x = 0; x < kW && c.calls == 0; ++x) EXPECT_EQ(out->GetFlt(x, 1).A, tracked->GetFlt(x, 1).A) << x;
    }

    // Clear Cache deletes the tool's files and the kept mattes; Regenerate All tracks the span again and rewrites them.
    T::SetNumbers(op, {{"CacheClear", 1}});
    EXPECT_TRUE(CacheFiles().empty());
    size_t before = provider->calls.size();
    ASSERT_TRUE(Render(op, 3.0));
    EXPECT_EQ(provider->calls.size() - before, 2u); // carried from the reference frame again
    T::SetNumbers(op, {{"CacheClear", 1}, {"CacheRegen", 1}});
    EXPECT_EQ(provider->calls.size() - before, 6u) << T::ConsoleText(doc); // frames 2 to 5, as a run
    EXPECT_EQ(std::get<6>(Call(provider->calls.size() - 1)), 1);           // the calls were a run's
    EXPECT_EQ(CacheFiles().size(), 4u);
}

TEST_F(MagicMaskTest, TheDiskCacheKeepsToItsLimitByDroppingTheOldestFrames) {
    // Frames of 1024 x 256 make files of 2 MiB (a 48-byte header, then two float planes); with a limit of 3 MiB a
    // run of three frames leaves only the last one's.
    setenv("ORVANE_MAGIC_MASK_CACHE_LIMIT", "3", 1);
    const int w = 1024, h = 256;
    Ref<Image> plate = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    ASSERT_TRUE(plate->AllocScanLineData());
    plate->Fill(FltPixel{0.5f, 0.25f, 0.75f, 1.f});
    Operator *op = AddMask(doc);
    ASSERT_TRUE(op->FindInput("Input")->ConnectTo(T::AddImageSource(doc, "Big", plate)->Out()));
    RenderTask task;
    ASSERT_TRUE(Track(op, 1, 3, task)) << T::ConsoleText(doc);
    const auto files = CacheFiles();
    ASSERT_EQ(files.size(), 1u);
    EXPECT_EQ(std::filesystem::file_size(files[0]), 48u + 2u * w * h * sizeof(float));
    int32_t frame = -1;
    std::ifstream(files[0], std::ios::binary).seekg(16).read(reinterpret_cast<char *>(&frame), sizeof frame);
    EXPECT_EQ(frame, 3);
}

TEST_F(MagicMaskTest, StrokeButtonsEditTheStrokes) {
    // Keys on frames 0 (the current frame: the render start), 4 and 12 (outside the render range 0 to 10), each
    // with two positive strokes and one negative. A result lists (key frame, positive, negative) per key, a
    // constant as frame -1.
    using Summary = std::vector<std::tuple<double, size_t, size_t>>;
    const Ref<Parameter> three = Strokes({{0.1, 0.1}, {0.2, 0.2}}, {{0.3, 0.3}});
    const struct {
        bool animated;
        std::vector<std::pair<const char *, double>> presses;
        Summary expected;
    } cases[] = {
        {false, {{"DeleteStrokes", 1}}, {{-1, 1, 1}}},
        {false, {{"StrokeMode", 1}, {"DeleteStrokes", 1}}, {{-1, 2, 0}}},
        {false, {{"DeleteStrokes", 1}, {"DeleteStrokes", 1}, {"DeleteStrokes", 1}}, {{-1, 0, 1}}},
        {false, {{"ClearCurrent", 1}}, {{-1, 0, 0}}},
        {false, {{"ClearRange", 1}}, {{-1, 0, 0}}},
        {true, {{"DeleteStrokes", 1}}, {{0, 1, 1}, {4, 2, 1}, {12, 2, 1}}},
        {true, {{"ClearCurrent", 1}}, {{4, 2, 1}, {12, 2, 1}}},
        {true, {{"ClearRange", 1}}, {{12, 2, 1}}},
        {true, {{"ClearAll", 1}}, {{-1, 0, 0}}},
    };
    for (size_t i = 0; i < std::size(cases); ++i) {
        OrvaneDoc local;
        local.SetRenderRange(0, 10);
        Operator *op = AddMask(local);
        Input *strokes = op->FindInput("Strokes");
        if (cases[i].animated) {
            AnimCurve curve;
            for (double t : {0.0, 4.0, 12.0}) curve.SetKey(t, three, KeyInterp::Hold);
            ASSERT_TRUE(strokes->SetCurve(curve));
        } else {
            ASSERT_TRUE(strokes->SetValue(three));
        }
        for (const auto &[id, value] : cases[i].presses) T::SetNumbers(op, {{id, value}});
        Summary got;
        auto add = [&got](double t, const Ref<Parameter> &v) {
            const ScriptVal form = v ? v->ToScript() : ScriptVal::Table();
            auto count = [&form](const char *key) { return form.Find(key) ? form.Find(key)->ArrayLength() : 0; };
            got.emplace_back(t, count("PosStrokes"), count("NegStrokes"));
        };
        if (strokes->IsAnimated())
            for (const Keyframe &k : strokes->Curve()->Keys()) add(k.time, k.value);
        else
            add(-1, strokes->Constant());
        EXPECT_EQ(got, cases[i].expected) << "case " << i;
    }
    // The positive stroke left is the first one drawn.
    OrvaneDoc local;
    Operator *op = AddMask(local);
    op->FindInput("Strokes")->SetValue(three);
    T::SetNumbers(op, {{"DeleteStrokes", 1}});
    EXPECT_TRUE(op->FindInput("Strokes")->Constant()->Equals(*Strokes({{0.1, 0.1}}, {{0.3, 0.3}})));
}

} // namespace
} // namespace Orvane
