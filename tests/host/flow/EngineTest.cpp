// The request walk of the flow engine, seen from inside small tools.
#include <algorithm>
#include <cmath>
#include <functional>
#include <new>
#include <optional>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::enginetest {
namespace ts = ::Orvane::Test;
namespace {

std::string R(const ImgRectI &r) { return ts::RectText(r); }
std::string D(const std::optional<ImageDomain> &d) { return d ? R(d->rect) : "none"; }
std::string D(const std::optional<ImgRectI> &r) { return r ? R(*r) : "none"; }
EvalOptions Region(const std::optional<ImgRectI> &r) {
    return {.roi = r ? std::optional(ImageDomain(*r)) : std::nullopt};
}

/// What a tool saw at one CheckRequest or Process call.
struct Seen {
    int pri = 0;
    bool precalc = false;
    std::vector<bool> hasData{};                          ///< per watched input
    std::vector<std::optional<ImageDomain>> roi{}, dod{}; ///< per watched input
    std::optional<ImageDomain> reqRoI{}, outDoD{};
    bool inputNoData = false; ///< the main input image (when present) had no rows
    ImgRectI inputWindow{};   ///< data window of the main input image
};

/// A tool with inputs on five priority levels, declared out of order: Last (1999), Input (image, -1), Amount (0), Late
/// (image, 5), Matte (mask, -1000).
class Probe : public ThreadedOperator {
public:
    using ThreadedOperator::ThreadedOperator;
    Seen Snapshot(const Request *req) const {
        Seen s{.pri = req->GetPri(), .precalc = req->IsPreCalc()};
        for (const Input *in : watched) {
            s.hasData.push_back(req->GetInputData(in) != nullptr);
            s.roi.push_back(req->GetInputRoI(in));
            s.dod.push_back(req->GetInputDoD(in));
        }
        if (const AutoImageRoI roi(req); roi) s.reqRoI = *roi.Get();
        if (const AutoImageDoD dod(req); dod) s.outDoD = *dod.Get();
        if (auto *img = dynamic_cast<const Image *>(req->GetInputData(input)))
            std::tie(s.inputNoData, s.inputWindow) = std::pair(img->IsNoData(), img->DataWindow());
        return s;
    }
    void CheckRequest(Request *req) override {
        ThreadedOperator::CheckRequest(req);
        checks[req->IsPreCalc()].push_back(Snapshot(req));
        if (onCheck) onCheck(*this, req);
    }
    void Process(Request *req) override {
        calls.push_back(Snapshot(req));
        if (!req->IsPreCalc()) seenInput = Ref<Image>(dynamic_cast<Image *>(req->GetInputData(input)));
        if (onProcess) return onProcess(*this, req);
        MakeOutput(req);
    }
    /// The tool's own work: a fixed colour function of the main input (or of Late when Input was dropped) over the
    /// input's data window and region.
    void MakeOutput(Request *req) {
        auto *src = dynamic_cast<Image *>(req->GetInputData(input));
        if (!src) src = dynamic_cast<Image *>(req->GetInputData(late));
        if (!src) return req->SetOutputData(output, nullptr);
        const float gain = static_cast<float>(dynamic_cast<const Number &>(*req->GetInputData(amount)).value);
        ImgRectI dw = src->DataWindow();
        if (const AutoImageRoI roi(req); roi) dw &= roi->rect;
        const FltPixel canvas = Color(src->GetCanvasColor(), gain);
        Ref<Image> img = NewImageTagList(
            {{ImgLikeImage, src}, {ImgDataWindow, &dw}, {ImgNoData, req->IsPreCalc()}, {ImgCanvasColor, &canvas}});
        if (!req->IsPreCalc() && !dw.IsNull()) {
            img->AllocScanLineData();
            auto row = [&](int i) {
                for (int x = dw.x0; x < dw.x1; ++x) img->PutFlt(x, dw.y0 + i, Color(src->GetFlt(x, dw.y0 + i), gain));
            };
            DoMultiProcess(row, dw.Height());
        }
        req->SetOutputData(output, img.Get());
    }
    static FltPixel Color(const FltPixel &p, float gain) {
        return {p.R * gain + 0.125f, std::sqrt(std::fabs(p.G)), p.B * p.A, p.A};
    }
    long PixelCalls() const {
        return std::ranges::count_if(calls, [](const Seen &s) { return !s.precalc; });
    }
    Input *last = ts::AddIn(this, "Last", CLSID_DataType_Number, {{InputPriority, PriorityLast}});
    Input *input = ts::AddImageIn(this);
    Input *amount = ts::AddIn(this, "Amount", CLSID_DataType_Number, {{InputDefault, 0.5}});
    Input *late = ts::AddIn(this, "Late", CLSID_DataType_Image, {{InputPriority, 5}, {InputRequired, 0}});
    Input *matte = ts::AddIn(this, "Matte", CLSID_DataType_Mask, {{InputPriority, PriorityMask}, {InputRequired, 0}});
    Output *output = ts::AddImageOut(this);
    std::vector<Input *> watched{last, input, amount, late, matte};
    std::vector<Seen> checks[2], calls; ///< checks of the pixel walk and of the pre-calculation
    Ref<Image> seenInput;
    std::function<void(Probe &, Request *)> onCheck, onProcess;
};

/// Index of each watched input in Seen's vectors, and its priority.
enum Watched { WLast, WInput, WAmount, WLate, WMatte, WCount };
constexpr int WatchedPriority[WCount] = {PriorityLast, PriorityImage, PriorityDefault, 5, PriorityMask};
constexpr bool WatchedIsImage[WCount] = {false, true, false, true, true};

struct Classes {
    ClassFactory make = &ts::MakeTool<Probe>;
    OvID probe = ts::RegisterTestTool("EngineTestProbe", make);
    OvID noRoI = ts::RegisterTestTool("EngineTestProbeNoRoI", make, {{RegSupportsRoI, 0}});
    OvID noDoD = ts::RegisterTestTool("EngineTestProbeNoDoD", make, {{RegSupportsDoD, 0}});
    OvID common = ts::RegisterTool("EngineTestProbeCommon", make, {{RegSupportsRoI, 1}, {RegSupportsDoD, 1}});
};
const Classes &C() { return ts::Once<Classes>(); }

/// A document with a 12 x 8 source "Src" and probes fed from it or from each other.
struct Doc {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", ts::PatternImage(12, 8));
    Probe *Add(const std::string &name, Output *from, OvID cls = C().probe) {
        auto *p = dynamic_cast<Probe *>(doc->AddTool(cls, name));
        EXPECT_TRUE(p && (!from || p->input->ConnectTo(from)));
        return p;
    }
};

/// A probe fed on all three image inputs: Input, Late and Matte.
struct Fed : Doc {
    ts::ImageSourceTool *late = ts::AddImageSource(*doc, "LateSrc", ts::PatternImage(12, 8, 8, 2));
    ts::ImageSourceTool *matte = ts::AddImageSource(*doc, "MatteSrc", ts::PatternImage(12, 8, DepthAFlt32, 4));
    Probe *probe = Add("Probe1", src->Out());
    Fed() { EXPECT_TRUE(probe->late->ConnectTo(late->Out()) && probe->matte->ConnectTo(matte->Out())); }
};

TEST(Engine, InputsArriveLevelByLevelLowestFirst) {
    Fed f;
    std::vector<double> amountAtLast;
    f.probe->onCheck = [&](Probe &p, Request *req) {
        if (req->GetPri() == PriorityLast)
            amountAtLast.push_back(dynamic_cast<const Number &>(*req->GetInputData(p.amount)).value);
    };
    ts::SetNumber(f.probe, "Amount", 0.75);
    ASSERT_TRUE(ts::EvalImage(f.probe) && f.probe->PixelCalls() == 1);
    const std::vector<int> levels{PriorityMask, PriorityImage, PriorityDefault, 5, PriorityLast};
    for (const bool precalc : {true, false}) {
        const std::vector<Seen> checks = f.probe->checks[precalc];
        ASSERT_EQ(checks.size(), levels.size()) << "one CheckRequest per level";
        for (size_t k = 0; k < levels.size(); ++k) {
            SCOPED_TRACE(testing::Message() << (precalc ? "pre-calculation" : "pixels") << ", level " << levels[k]);
            EXPECT_EQ(checks[k].pri, levels[k]);
            // Lower levels have arrived, this one and those above not; image domains are known from an input's level.
            for (int w = 0; w < WCount; ++w)
                EXPECT_EQ(
                    std::pair(bool(checks[k].hasData[w]), checks[k].dod[w].has_value()),
                    std::pair(WatchedPriority[w] < levels[k], WatchedIsImage[w] && WatchedPriority[w] <= levels[k]))
                    << "input " << w;
        }
    }
    // Constants arrive with their values before the higher levels, in both walks.
    EXPECT_EQ(amountAtLast, (std::vector<double>{0.75, 0.75}));
    // Process sees everything; every source rendered once.
    EXPECT_EQ(f.probe->calls.back().hasData, std::vector<bool>(WCount, true));
    for (const ts::ImageSourceTool *s : {f.src, f.late, f.matte}) EXPECT_EQ(s->processCount, 1) << s->Name();
}

TEST(Engine, SettingInputDataStopsTheFetch) {
    const Ref<Image> given = ts::PatternImage(12, 8, 8, 9);
    // The CheckRequest level that sets it, the input set, and what it is set to.
    const std::tuple<const char *, int, Watched, const Image *> cases[] = {
        {"null image at its own level", PriorityImage, WInput, nullptr},
        {"null image from an earlier level", PriorityMask, WLate, nullptr},
        {"null mask at its own level", PriorityMask, WMatte, nullptr},
        {"an image given in place of the input's", PriorityImage, WInput, given.Get()},
    };
    for (const auto &[name, level, input, value] : cases) {
        SCOPED_TRACE(name);
        Fed f;
        f.probe->onCheck = [&, level = level, input = input, value = value](Probe &p, Request *req) {
            if (!req->IsPreCalc() && req->GetPri() == level)
                req->SetInputData(p.watched[input], const_cast<Image *>(value));
        };
        Ref<Image> out = ts::EvalImage(f.probe);
        ASSERT_TRUE(out && !f.probe->calls.back().precalc);
        EXPECT_EQ(f.probe->calls.back().hasData[input], value != nullptr);
        for (const auto &[s, w] : {std::pair{f.src, WInput}, {f.late, WLate}, {f.matte, WMatte}})
            EXPECT_EQ(s->processCount, input == w ? 0 : 1) << s->Name();
        EXPECT_TRUE(ts::ConsoleText(*f.doc).empty());
        EXPECT_TRUE(!value || out->GetFlt(3, 4) == Probe::Color(value->GetFlt(3, 4), 0.5f));
    }
}

TEST(Engine, RegionsOfInterestReachUpstream) {
    using Rect = std::optional<ImgRectI>;
    // The asker's region, what CheckRequest sets on Input, and what the tool above must see.
    const std::tuple<const char *, bool, Rect, Rect, Rect> cases[] = {
        {"whole frame", true, std::nullopt, std::nullopt, std::nullopt},
        {"default is the request's", true, ImgRectI(1, 2, 9, 6), std::nullopt, ImgRectI(1, 2, 9, 6)},
        {"narrowed", true, ImgRectI(1, 2, 9, 6), ImgRectI(3, 3, 5, 5), ImgRectI(3, 3, 5, 5)},
        {"narrowed from a whole frame", true, std::nullopt, ImgRectI(0, 0, 4, 4), ImgRectI(0, 0, 4, 4)},
        {"a tool without region support", false, ImgRectI(2, 2, 5, 5), std::nullopt, std::nullopt},
    };
    const ImgRectI frame(0, 0, 12, 8);
    for (const auto &[name, supportsRoI, requested, narrowed, upstream] : cases) {
        SCOPED_TRACE(name);
        Doc d;
        Probe *up = d.Add("Up", d.src->Out());
        Probe *p = d.Add("Probe1", up->output, supportsRoI ? C().probe : C().noRoI);
        p->onCheck = [narrowed = narrowed](Probe &self, Request *req) {
            if (req->IsPreCalc() || req->GetPri() != PriorityImage || !narrowed) return;
            const ImageDomain roi(*narrowed);
            req->SetInputRoI(self.input, &roi);
        };
        Ref<Image> out = ts::EvalImage(p, 0.0, Region(requested));
        ASSERT_TRUE(out && p->checks[false].size() == 5u);
        const Rect seen = supportsRoI ? requested : std::nullopt;
        EXPECT_EQ(D(p->checks[false][1].roi[WInput]), D(seen)) << "the default region of an input is the request's";
        EXPECT_EQ(D(p->calls.back().reqRoI), D(seen));
        EXPECT_EQ(D(p->calls.back().roi[WInput]), D(upstream));
        EXPECT_EQ(D(up->calls.back().reqRoI), D(upstream));
        // The tool above cuts its output to its region, the tool itself to its own.
        EXPECT_EQ(R(out->DataWindow()), R(frame & upstream.value_or(frame) & seen.value_or(frame)));
    }
}

TEST(Engine, EveryPixelRequestFollowsAPreCalculationAndAToolWithoutDoDSupportGetsWholeFrames) {
    // The tool chooses a data window of its own; the pixel pass must know it as the output's domain before Process
    // runs.
    const ImgRectI own(1, 2, 5, 7);
    for (const std::optional<ImgRectI> &roi : {std::optional<ImgRectI>(), std::optional(ImgRectI(0, 0, 3, 3))}) {
        SCOPED_TRACE(roi ? "region request" : "whole frame");
        Fed f;
        f.probe->onProcess = [&](Probe &p, Request *req) {
            ImgRectI dw = own;
            if (const AutoImageRoI r(req); r) dw &= r->rect;
            Ref<Image> img = NewImageTagList(
                {{ImgLikeImage, req->GetInputData(p.input)}, {ImgDataWindow, &dw}, {ImgNoData, req->IsPreCalc()}});
            if (!req->IsPreCalc()) img->Fill({1, 1, 1, 1});
            req->SetOutputData(p.output, img.Get());
        };
        Ref<Image> out = ts::EvalImage(f.probe, 0.0, Region(roi));
        ASSERT_TRUE(out && f.probe->calls.size() == 2u);
        // The pre-calculation covers the whole domain.
        EXPECT_EQ(std::pair(f.probe->calls[0].precalc, D(f.probe->calls[0].reqRoI)),
                  std::pair(true, std::string("none")));
        EXPECT_EQ(D(f.probe->calls[1].outDoD), R(own));
        EXPECT_EQ(R(out->DataWindow()), R(roi ? own & *roi : own));
    }
    const FltPixel canvas{0.1f, 0.2f, 0.3f, 0.4f};
    // The class, the source's data window and the window the tool sees.
    const std::tuple<const char *, OvID, ImgRectI, ImgRectI> cases[] = {
        {"domains: inside the frame", C().probe, ImgRectI(2, 3, 6, 7), ImgRectI(2, 3, 6, 7)},
        {"whole frames: inside the frame", C().noDoD, ImgRectI(2, 3, 6, 7), ImgRectI(0, 0, 10, 8)},
        {"whole frames: across the frame", C().noDoD, ImgRectI(-2, -1, 4, 5), ImgRectI(-2, -1, 10, 8)},
        {"whole frames: already covering", C().noDoD, ImgRectI(-1, -1, 11, 9), ImgRectI(-1, -1, 11, 9)},
    };
    for (const auto &[name, cls, sourceWindow, seenWindow] : cases) {
        SCOPED_TRACE(name);
        Doc d;
        Ref<Image> srcImg = ts::WindowedImage(10, 8, sourceWindow, canvas, 3);
        d.src->SetImage(srcImg);
        Probe *p = d.Add("Probe1", d.src->Out(), cls);
        ASSERT_TRUE(ts::EvalImage(p) && p->calls.size() == 2u && p->seenInput);
        for (const Seen &s : p->calls)
            EXPECT_EQ(std::tuple(R(s.inputWindow), D(s.dod[WInput]), s.inputNoData),
                      std::tuple(R(seenWindow), R(seenWindow), s.precalc));
        // The canvas made real: the source's pixels inside its window, its canvas colour elsewhere.
        for (int y = seenWindow.y0; y < seenWindow.y1; ++y)
            for (int x = seenWindow.x0; x < seenWindow.x1; ++x)
                ASSERT_EQ(p->seenInput->GetFlt(x, y), sourceWindow.Contains(x, y) ? srcImg->GetFlt(x, y) : canvas)
                    << x << "," << y;
    }
}

TEST(Engine, AFailingToolStopsTheChainWithItsOneLineAndSoDoesOneThatGivesNothingOrLacksARequiredImage) {
    enum How { Fails, FailsInPreCalcToo, RunsOutOfMemory, RunsOutOfMemoryInAChunk };
    const char *const failed = "Bad: cannot go on at time 2", *const noMemory = "Bad: out of memory (time = 2.000000)";
    // How it fails, which input of the tool below it feeds, whether that tool below is evaluated, the line.
    const std::tuple<const char *, How, Watched, bool, const char *> cases[] = {
        {"pixels, main input", Fails, WInput, true, failed},
        {"pre-calculation too", FailsInPreCalcToo, WInput, true, failed},
        {"optional image input", Fails, WLate, true, failed},
        {"optional mask input", Fails, WMatte, true, failed},
        {"out of memory in Process", RunsOutOfMemory, WInput, false, noMemory},
        {"out of memory in a chunk", RunsOutOfMemoryInAChunk, WInput, false, noMemory},
        {"out of memory seen from downstream", RunsOutOfMemory, WInput, true, noMemory},
    };
    for (const auto &[name, how, feeds, evalDown, line] : cases) {
        SCOPED_TRACE(name);
        Doc d;
        Probe *bad = d.Add("Bad", d.src->Out()), *down = d.Add("Down", d.src->Out());
        ASSERT_TRUE(down->watched[feeds]->ConnectTo(bad->output));
        bad->onProcess = [&, how = how](Probe &p, Request *req) {
            if (req->IsPreCalc() && how != FailsInPreCalcToo) return p.MakeOutput(req);
            if (how == RunsOutOfMemory) throw std::bad_alloc();
            if (how == RunsOutOfMemoryInAChunk) {
                p.DoMultiProcess([](int i) { i == 3 ? throw std::bad_alloc() : void(); }, 8);
                return p.MakeOutput(req);
            }
            d.doc->PrintF(req, ConsoleError, "%s: cannot go on at time %g\n", p.Name().c_str(), req->Time());
            req->SetOutputData(p.output, nullptr);
        };
        EXPECT_FALSE(ts::EvalImage(evalDown ? down : bad, 2.0));
        EXPECT_EQ(ts::ConsoleText(*d.doc), "error: " + std::string(line) + "\n");
        EXPECT_EQ(down->PixelCalls(), 0) << "the tool below does not run";
    }
    Doc e;
    Probe *silent = e.Add("Silent", e.src->Out()), *p = e.Add("Lonely1", nullptr);
    silent->onProcess = [](Probe &p, Request *req) { req->IsPreCalc() ? p.MakeOutput(req) : void(); };
    EXPECT_FALSE(ts::EvalImage(silent, 4.0));
    ASSERT_TRUE(p->late->ConnectTo(e.src->Out())); // the tool could work from Late alone
    EXPECT_FALSE(ts::EvalImage(p) || !p->calls.empty());
    // Optional inputs may stay unconnected.
    ASSERT_TRUE(p->input->ConnectTo(e.src->Out()));
    p->late->Disconnect();
    EXPECT_TRUE(ts::EvalImage(p));
    EXPECT_EQ(ts::ConsoleText(*e.doc),
              "error: Silent: produced no result at time 4\nerror: Lonely1: input \"Input\" is not connected\n");
}

TEST(Engine, AnAbortedRenderReturnsNullSilently) {
    // Before the render, in an upstream tool's Process, in CheckRequest, in Process after the output was set.
    enum Where { Before, UpstreamProcess, OwnCheck, OwnProcess };
    for (const Where where : {Before, UpstreamProcess, OwnCheck, OwnProcess}) {
        SCOPED_TRACE(where);
        Doc d;
        Probe *up = d.Add("Up", d.src->Out());
        Probe *p = d.Add("Own", up->output);
        RenderTask task;
        if (where == Before) task.Abort();
        auto abortIn = [&](Where here, Request *req) {
            if (where == here && !req->IsPreCalc() && req->GetTask()) req->GetTask()->Abort();
        };
        up->onProcess = [&](Probe &self, Request *req) { abortIn(UpstreamProcess, req), self.MakeOutput(req); };
        p->onCheck = [&](Probe &, Request *req) { abortIn(OwnCheck, req); };
        p->onProcess = [&](Probe &self, Request *req) { self.MakeOutput(req), abortIn(OwnProcess, req); };
        EXPECT_FALSE(ts::EvalImage(p, 0.0, EvalOptions{.roi = std::nullopt, .task = &task}));
        EXPECT_TRUE(task.IsAborted());
        // Nothing half-made was kept: a render without the task works.
        Ref<Image> out = ts::EvalImage(p);
        EXPECT_TRUE(out && !out->IsNoData());
        EXPECT_TRUE(ts::ConsoleText(*d.doc).empty());
    }
}

TEST(Engine, ResultsAreBitIdenticalForAnyWorkerCount) {
    Doc d;
    d.src->SetImage(ts::PatternImage(97, 61, 8, 5));
    Probe *a = d.Add("A", d.src->Out(), C().common);
    Probe *b = d.Add("B", a->output, C().common);
    ASSERT_TRUE(a->FindInput("EffectMask")
                    ->ConnectTo(ts::AddImageSource(*d.doc, "Mask", ts::PatternImage(97, 61, 8, 6))->Out()));
    ts::SetNumbers(a, {{"Blend", 0.6}, {"EffectMaskChannel", 4}});
    ts::SetNumbers(b, {{"Amount", 1.7}, {"ProcessGreen", 0}, {"Blend", 0.35}});
    const int before = WorkerCount();
    std::vector<std::vector<uint8_t>> runs;
    for (const int workers : {1, 4, 3, 1}) {
        SetWorkerCount(workers);
        Ref<Image> out = ts::EvalImage(b, 0.0, EvalOptions{.roi = std::nullopt, .useCache = false});
        ASSERT_TRUE(out);
        runs.emplace_back(); // every byte of every row of the data window
        for (int y = out->DataWindow().y0; y < out->DataWindow().y1; ++y)
            runs.back().insert(runs.back().end(), out->ScanLine(y), out->ScanLine(y) + out->RowBytes());
    }
    SetWorkerCount(before);
    for (size_t i = 1; i < runs.size(); ++i) EXPECT_TRUE(!runs[0].empty() && runs[i] == runs[0]) << "run " << i;
}

} // namespace
} // namespace Orvane::enginetest
