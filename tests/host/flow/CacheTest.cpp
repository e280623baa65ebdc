// The result cache on its own and through the engine.
#include <optional>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/flow/ResultCache.h"
#include "host/image/NewImage.h"
#include "host/image/PixelMemory.h"
#include "tests/support/TestSupport.h"

namespace Orvane::cachetest {
namespace ts = ::Orvane::Test;
namespace {

std::optional<ImageDomain> Region(int x0, int y0, int x1, int y1) { return ImageDomain(ImgRectI(x0, y0, x1, y1)); }
const std::optional<ImageDomain> Whole;

Ref<Parameter> Img(int w, int h) { return ts::PatternImage(w, h); }

/// Outputs standing for cache keys (owned by no tool).
struct Outputs {
    Output a{nullptr, "A", OvID("A"), {}, 0};
    Output b{nullptr, "B", OvID("B"), {}, 1};
};

CacheKey Key(const Output &out, double time = 0.0, uint32_t traits = 0, uint64_t state = 7) {
    return CacheKey{&out, time, traits, state};
}

TEST(ResultCache, FindsOnlyWhatWasStoredUnderTheSameKeyAndAWholeFrameResultServesAllAndReplacesRegionResults) {
    Outputs o;
    ResultCache cache;
    Ref<Parameter> v = MakeRef<Number>(1.0), img = Img(4, 4);
    cache.Store(Key(o.a), Whole, v);
    EXPECT_EQ(cache.Find(Key(o.a), Whole).Get(), v.Get());
    for (const CacheKey &k : {Key(o.b), Key(o.a, 1.0), Key(o.a, 0.0, ReqFlagPreCalc), Key(o.a, 0.0, 0, 8)})
        EXPECT_FALSE(cache.Find(k, Whole));
    EXPECT_EQ(cache.Entries(), 1u);
    EXPECT_EQ(std::pair(cache.GetStats().hits, cache.GetStats().misses), std::pair(size_t(1), size_t(4)));
    // The same region, one inside, one reaching out, a disjoint one, the whole frame.
    cache.Store(Key(o.a, 2.0), Region(2, 2, 10, 8), img);
    for (const auto &served : {Region(2, 2, 10, 8), Region(3, 4, 9, 5)})
        EXPECT_EQ(cache.Find(Key(o.a, 2.0), served).Get(), img.Get());
    for (const auto &missed : {Region(1, 2, 10, 8), Region(20, 20, 30, 30), Whole})
        EXPECT_FALSE(cache.Find(Key(o.a, 2.0), missed));
    cache.Clear();
    Ref<Parameter> left = Img(4, 4), right = Img(5, 5), whole = Img(8, 8);
    cache.Store(Key(o.a), Region(0, 0, 4, 8), left);
    cache.Store(Key(o.a), Region(4, 0, 8, 8), right);
    cache.Store(Key(o.b), Region(0, 0, 4, 8), left); // another output keeps its own
    EXPECT_EQ(cache.Find(Key(o.a), Region(1, 1, 3, 3)).Get(), left.Get());
    EXPECT_EQ(cache.Find(Key(o.a), Region(5, 1, 7, 3)).Get(), right.Get());
    EXPECT_FALSE(cache.Find(Key(o.a), Region(3, 1, 5, 3))) << "no one region covers this";
    cache.Store(Key(o.a), Whole, whole);
    EXPECT_EQ(std::pair(cache.Entries(), cache.Bytes()), std::pair(size_t(2), whole->SizeOf() + left->SizeOf()));
    for (const auto &asked : {Whole, Region(1, 1, 3, 3), Region(5, 1, 7, 3), Region(-50, -50, 50, 50)})
        EXPECT_EQ(cache.Find(Key(o.a), asked).Get(), whole.Get());
    EXPECT_EQ(cache.Find(Key(o.b), Region(0, 0, 4, 8)).Get(), left.Get());
    // A larger region replaces the regions it holds, not the others.
    ResultCache regions;
    Ref<Parameter> big = Img(6, 6);
    regions.Store(Key(o.a), Region(0, 0, 2, 2), left);
    regions.Store(Key(o.a), Region(10, 10, 12, 12), right);
    regions.Store(Key(o.a), Region(0, 0, 4, 4), big);
    EXPECT_EQ(regions.Find(Key(o.a), Region(0, 0, 2, 2)).Get(), big.Get());
    EXPECT_EQ(regions.Find(Key(o.a), Region(10, 10, 12, 12)).Get(), right.Get());
    EXPECT_EQ(std::pair(regions.Entries(), regions.Bytes()), std::pair(size_t(2), big->SizeOf() + right->SizeOf()));
}

TEST(ResultCache, EvictsLeastRecentlyUsedBeyondTheBudget) {
    Outputs o;
    Ref<Parameter> v[4] = {Img(16, 16), Img(16, 16), Img(16, 16), Img(16, 16)};
    const size_t one = v[0]->SizeOf();
    ASSERT_GT(one, 16u * 16u * 16u) << "an image accounts for its pixels";
    ResultCache cache(one * 2 + one / 2); // room for two
    cache.Store(Key(o.a, 0), Whole, v[0]);
    cache.Store(Key(o.a, 1), Whole, v[1]);
    ASSERT_TRUE(cache.Find(Key(o.a, 0), Whole)); // 0 is now the most recent
    cache.Store(Key(o.a, 2), Whole, v[2]);       // 1 goes
    EXPECT_EQ(std::pair(cache.Entries(), cache.Bytes()), std::pair(size_t(2), 2 * one));
    for (int t = 0; t < 3; ++t) EXPECT_EQ(bool(cache.Find(Key(o.a, t), Whole)), t != 1) << t;
    EXPECT_EQ(cache.GetStats().evictions, 1u);
    // A smaller budget evicts at once, oldest first; a value larger than the whole budget is not kept, and
    // evicts nothing for its sake.
    cache.SetBudget(one + one / 2);
    EXPECT_EQ(std::pair(cache.Entries(), cache.Bytes()), std::pair(size_t(1), one));
    cache.Store(Key(o.a, 3), Whole, Img(64, 64));
    EXPECT_FALSE(cache.Find(Key(o.a, 3), Whole));
    EXPECT_TRUE(cache.Find(Key(o.a, 2), Whole));
    EXPECT_EQ(std::pair(cache.Entries(), cache.Bytes()), std::pair(size_t(1), one));
    cache.Clear();
    EXPECT_EQ(std::pair(cache.Entries(), cache.Bytes()), std::pair(size_t(0), size_t(0)));
}

TEST(ResultCache, StoringTheSameKeyAgainReplacesForgetDropsOneOutputsEntriesAndReclaimOnlyWhatNobodyHolds) {
    Outputs o;
    ResultCache cache;
    Ref<Parameter> first = Img(8, 8), second = Img(4, 4), y = Img(6, 6);
    cache.Store(Key(o.a), Region(0, 0, 4, 4), first);
    cache.Store(Key(o.a), Region(0, 0, 4, 4), second);
    EXPECT_EQ(std::pair(cache.Entries(), cache.Bytes()), std::pair(size_t(1), second->SizeOf()));
    EXPECT_EQ(cache.Find(Key(o.a), Region(0, 0, 4, 4)).Get(), second.Get());
    cache.Store(Key(o.a), Whole, first);
    cache.Store(Key(o.a), Whole, second);
    cache.Store(Key(o.a, 1), Whole, nullptr); // nothing to keep
    EXPECT_EQ(std::pair(cache.Entries(), cache.Bytes()), std::pair(size_t(1), second->SizeOf()));
    cache.Store(Key(o.a, 1), Region(0, 0, 2, 2), first);
    cache.Store(Key(o.a, 1), Region(5, 5, 6, 6), first);
    cache.Store(Key(o.b, 0), Whole, y);
    cache.Forget(&o.a);
    EXPECT_EQ(std::pair(cache.Entries(), cache.Bytes()), std::pair(size_t(1), y->SizeOf()));
    EXPECT_FALSE(cache.Find(Key(o.a, 0), Whole));
    EXPECT_FALSE(cache.Find(Key(o.a, 1), Region(0, 0, 1, 1)));
    EXPECT_EQ(cache.Find(Key(o.b, 0), Whole).Get(), y.Get());
    cache.Clear();
    Ref<Parameter> held = Img(16, 16);
    const size_t one = held->SizeOf();
    for (int t = 0; t < 4; ++t) cache.Store(Key(o.a, t), Whole, t ? Img(16, 16) : held);
    // Time 0 is the oldest but still held elsewhere: 1 and then 2 go.
    EXPECT_EQ(cache.Reclaim(one + 1), 2 * one);
    for (int t = 0; t < 4; ++t) EXPECT_EQ(bool(cache.Find(Key(o.a, t), Whole)), t == 0 || t == 3) << t;
    EXPECT_EQ(cache.Reclaim(10 * one), one); // all that is left to let go
    EXPECT_EQ(cache.Bytes(), one);
}

FltPixel Scaled(const FltPixel &p, double gain) {
    const float k = static_cast<float>(gain);
    return {p.R * k, p.G * k, p.B * k, p.A * k};
}

/// out = in x Gain over the input's data window; View is passive.
struct GainTool : ThreadedOperator {
    GainTool(const Registry *reg, const ScriptVal &args, const TagList &tags)
        : ThreadedOperator(reg, args, tags),
          gain(ts::AddIn(this, "Gain", CLSID_DataType_Number, {{InputDefault, 1.0}})) {
        ts::AddIn(this, "View", CLSID_DataType_Number, {{InputPassive, 1}});
    }
    void Process(Request *req) override {
        auto *src = dynamic_cast<Image *>(req->GetInputData(input));
        const double k = dynamic_cast<Number *>(req->GetInputData(gain))->value;
        ImgRectI dw = src->DataWindow();
        if (const AutoImageRoI roi(req); roi) dw &= roi->rect;
        Ref<Image> img = NewImageTagList({{ImgLikeImage, src}, {ImgDataWindow, &dw}, {ImgNoData, req->IsPreCalc()}});
        if (!req->IsPreCalc()) {
            ++processCount;
            img->AllocScanLineData();
            for (int y = dw.y0; y < dw.y1; ++y)
                for (int x = dw.x0; x < dw.x1; ++x) img->PutFlt(x, y, Scaled(src->GetFlt(x, y), k));
        }
        req->SetOutputData(output, img.Get());
    }
    Input *input = ts::AddImageIn(this), *gain;
    Output *output = ts::AddImageOut(this);
    int processCount = 0;
};

/// Hands on its input, by reference, as it was `Offset` frames earlier.
struct ShiftTool : ThreadedOperator {
    // Offset is read before the image's level, so CheckRequest knows it when it sets the time.
    ShiftTool(const Registry *reg, const ScriptVal &args, const TagList &tags)
        : ThreadedOperator(reg, args, tags), input(ts::AddImageIn(this)),
          offset(ts::AddIn(this, "Offset", CLSID_DataType_Number, {{InputDefault, 5.0}, {InputPriority, -2}})),
          output(ts::AddImageOut(this)) {}
    void CheckRequest(Request *req) override {
        ThreadedOperator::CheckRequest(req);
        if (req->GetPri() != input->Priority()) return;
        auto *n = dynamic_cast<Number *>(req->GetInputData(offset));
        req->SetInputTime(input, req->Time() - (n ? n->value : 5.0));
    }
    void Process(Request *req) override { req->SetOutputData(output, req->GetInputData(input)); }
    Input *input, *offset;
    Output *output;
};

struct Classes {
    OvID gain = ts::RegisterTestTool("CacheTestGain", &ts::MakeTool<GainTool>);
    OvID noCache = ts::RegisterTestTool("CacheTestGainNoCache", &ts::MakeTool<GainTool>, {{RegNoCache, 1}});
    OvID unpredictable =
        ts::RegisterTestTool("CacheTestGainUnpredictable", &ts::MakeTool<GainTool>, {{RegUnpredictable, 1}});
    OvID shift = ts::RegisterTestTool("CacheTestShift", &ts::MakeTool<ShiftTool>);
};
const Classes &C() { return ts::Once<Classes>(); }

Ref<Image> Eval(Operator *op, double time = 0.0, const std::optional<ImageDomain> &roi = std::nullopt,
                bool useCache = true) {
    return ts::EvalImage(op, time, EvalOptions{.roi = roi, .useCache = useCache});
}

/// A gain of `first` at frame 0 rising to 3 at frame 10.
AnimCurve GainCurve(double first) { return ts::NumberCurve({{0.0, first}, {10.0, 3.0}}); }

/// Src -> Gain1, and more tools added below either.
struct Chain {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Ref<Image> image = ts::PatternImage(10, 6);
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", image);
    GainTool *tool = Add<GainTool>(C().gain, "Gain1", src->Out());
    template <class T> T *Add(OvID cls, const char *name, Output *from) {
        auto *t = dynamic_cast<T *>(doc->AddTool(cls, name));
        EXPECT_TRUE(t && t->input->ConnectTo(from));
        return t;
    }
};

TEST(EngineCache, RegionsAreServedWhenCoveredAndRenderedWhenNotAndUseCacheFalseBypassesTheCache) {
    Chain c;
    ASSERT_TRUE(Eval(c.tool, 0.0, Region(2, 1, 8, 5)) && Eval(c.tool, 0.0, Region(3, 2, 6, 4))); // inside: served
    EXPECT_EQ(c.tool->processCount, 1);
    ASSERT_TRUE(Eval(c.tool, 0.0, Region(1, 1, 8, 5))); // reaches out: rendered
    EXPECT_EQ(c.tool->processCount, 2);
    Ref<Image> whole = Eval(c.tool); // the whole frame: rendered, then serves every region
    ASSERT_TRUE(whole);
    EXPECT_EQ(Eval(c.tool, 0.0, Region(0, 0, 2, 2)).Get(), whole.Get());
    EXPECT_EQ(c.tool->processCount, 3);
    const int sourceRenders = c.src->processCount;
    for (int i = 0; i < 2; ++i) ASSERT_TRUE(Eval(c.tool, 0.0, Whole, false));
    EXPECT_EQ(c.tool->processCount, 5);
    EXPECT_EQ(c.src->processCount, sourceRenders + 2);
}

TEST(EngineCache, InputChangesRenderAgainUnlessPassiveAnimatedInputsPerTimeAndEditsReachBelowATimeShift) {
    for (const auto &[name, input, value, renders] : {std::tuple{"a non-passive input", "Gain", 2.0, true},
                                                      {"a passive input", "View", 3.0, false},
                                                      {"the same value again", "Gain", 1.0, false}}) {
        SCOPED_TRACE(name);
        Chain ch;
        Ref<Image> before = Eval(ch.tool);
        ts::SetNumber(ch.tool, input, value);
        Ref<Image> after = Eval(ch.tool);
        ASSERT_TRUE(before && after);
        EXPECT_EQ(ch.tool->processCount, renders ? 2 : 1);
        EXPECT_EQ(after.Get() != before.Get(), renders);
        EXPECT_EQ(ch.src->processCount, 1) << "the source did not change";
    }
    Chain c;
    ASSERT_TRUE(c.tool->gain->SetCurve(GainCurve(1.0)));
    std::vector<Ref<Image>> results;
    for (int i = 0; i < 3; ++i) {
        results.push_back(Eval(c.tool, 5.0 * i));
        ASSERT_TRUE(results.back());
        EXPECT_EQ(results.back()->GetFlt(4, 2), Scaled(c.image->GetFlt(4, 2), 1.0 + i)) << "time " << 5 * i;
    }
    for (int i = 2; i >= 0; --i) EXPECT_EQ(Eval(c.tool, 5.0 * i).Get(), results[i].Get()) << "time " << 5 * i;
    EXPECT_EQ(c.tool->processCount, 3);
    // Edits seen at another time reach tools below a time shift: Gain1 -> Shift (5 frames earlier) -> Below.
    auto *shift = c.Add<ShiftTool>(C().shift, "Shift1", c.tool->output);
    auto *below = c.Add<GainTool>(C().gain, "Below", shift->output);
    ASSERT_TRUE(shift && below);
    auto expect = [&](double gain) {
        Ref<Image> out = Eval(below, 10.0);
        ASSERT_TRUE(out);
        EXPECT_EQ(out->GetFlt(4, 2), Scaled(c.image->GetFlt(4, 2), gain)) << "gain " << gain;
    };
    expect(2.0); // the curve at frame 5
    // An edit that leaves frame 10 alone but changes frame 5.
    ASSERT_TRUE(c.tool->gain->SetCurve(GainCurve(0.5)));
    expect(1.75);
    // Moving the shift changes what is seen too.
    ts::SetNumber(shift, "Offset", 10.0);
    expect(0.5);
}

TEST(EngineCache, VolatileToolsAndAllBelowThemAreNeverCached) {
    for (const OvID cls : {C().noCache, C().unpredictable}) {
        SCOPED_TRACE(cls.Text());
        Chain c; // Gain1 stands beside the volatile tool
        auto *vol = c.Add<GainTool>(cls, "Vol", c.src->Out());
        auto *below = c.Add<GainTool>(C().gain, "Below", vol->output);
        GainTool *aside = c.tool;
        ASSERT_TRUE(vol && below);
        for (int i = 0; i < 3; ++i) ASSERT_TRUE(Eval(below) && Eval(aside));
        EXPECT_EQ(std::pair(vol->processCount, below->processCount), std::pair(3, 3));
        // A tool beside the volatile one, and what is above it, cache as ever.
        EXPECT_EQ(std::pair(aside->processCount, c.src->processCount), std::pair(1, 1));
        EXPECT_TRUE(!StateHash(below->output, 0.0) && StateHash(aside->output, 0.0));
    }
}

TEST(EngineCache, PassThroughHandsOnTheSameObject) {
    Chain c;
    auto *p1 = c.Add<ShiftTool>(C().shift, "Pass1", c.src->Out());
    auto *p2 = c.Add<ShiftTool>(C().shift, "Pass2", p1->output);
    ASSERT_TRUE(p1 && p2);
    for (ShiftTool *p : {p1, p2}) ts::SetNumber(p, "Offset", 0);
    const int refsBefore = c.image->RefCount();
    Ref<Image> out = Eval(p2);
    EXPECT_EQ(out.Get(), c.image.Get());
    EXPECT_GT(c.image->RefCount(), refsBefore);
    out.Reset();
    EXPECT_EQ(Eval(p2).Get(), c.image.Get()) << "through the cache too";
    EXPECT_EQ(c.src->processCount, 1);
    // Letting the results go leaves the image to its owners.
    c.doc->Cache().Clear();
    EXPECT_EQ(c.image->RefCount(), refsBefore);
}

TEST(EngineCache, AChainOfPerPixelToolsHoldsTwoFramesUnderTheMemoryLimit) {
    constexpr int W = 512, H = 256; // 2 MiB a frame
    const size_t frame = size_t(W) * H * sizeof(FltPixel);
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Ref<Image> image = ts::PatternImage(W, H);
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", image);
    std::vector<GainTool *> gains;
    Output *up = src->Out();
    for (int i = 1; i <= 4; ++i) {
        gains.push_back(dynamic_cast<GainTool *>(doc->AddTool(C().gain, "Gain" + std::to_string(i))));
        ASSERT_TRUE(gains.back() && gains.back()->input->ConnectTo(up));
        ts::SetNumber(gains.back(), "Gain", 0.5 * i);
        up = gains.back()->output;
    }
    struct Restore {
        ~Restore() { SetPixelMemoryLimit(0); }
    } restore;
    // Room for the source and two and a half frames: the cache lets older results go.
    const size_t limit = PixelMemoryInUse() + frame * 5 / 2;
    SetPixelMemoryLimit(limit);
    ResetPixelMemoryPeak();
    Ref<Image> out = Eval(gains.back());
    ASSERT_TRUE(out);
    EXPECT_LE(PixelMemoryPeak(), limit);
    EXPECT_FLOAT_EQ(out->GetFlt(7, 9).G, image->GetFlt(7, 9).G * 0.5f * 1.0f * 1.5f * 2.0f);
    // Room for one frame more only: the second tool, which does not check its allocation, fails with the line saying
    // what it needed.
    out.Reset();
    doc->Cache().Clear();
    SetPixelMemoryLimit(PixelMemoryInUse() - PixelPoolBytes() + frame * 3 / 2);
    EXPECT_FALSE(Eval(gains.back()));
    ASSERT_FALSE(doc->ConsoleLines().empty());
    EXPECT_EQ(doc->ConsoleLines().back().text.rfind("Gain2: needs 2 MiB for a 512x256 RGBA float32 image;", 0), 0u);
}

} // namespace
} // namespace Orvane::cachetest
