// The request walk of the flow engine, seen from inside small tools: the
// order of priority levels, what has arrived at each CheckRequest, regions of
// interest and domains, pre-calculation, skipped inputs, failures, aborts and
// determinism over thread counts.
#include <cmath>
#include <cstring>
#include <functional>
#include <new>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::enginetest {
namespace ts = ::Orvane::Test;
namespace {

std::string R(const ImgRectI &r) {
    return "(" + std::to_string(r.x0) + "," + std::to_string(r.y0) + "," + std::to_string(r.x1) + "," +
           std::to_string(r.y1) + ")";
}
std::string D(const std::optional<ImageDomain> &d) { return d ? R(d->rect) : "none"; }

std::vector<ConsoleLine> Lines(const OrvaneDoc &doc) { return doc.ConsoleLines(); }

/// What a tool saw at one CheckRequest or Process call.
struct Seen {
    int pri = 0;
    bool precalc = false;
    std::vector<bool> hasData;                   ///< per watched input
    std::vector<std::optional<ImageDomain>> roi; ///< per watched input
    std::vector<std::optional<ImageDomain>> dod; ///< per watched input
    std::optional<ImageDomain> reqRoI, outDoD;
    bool inputNoData = false; ///< the main input image (when present) had no rows
    ImgRectI inputWindow;     ///< data window of the main input image
};

/// A tool with inputs on five priority levels, declared out of order:
/// Last (1999), Input (image, -1), Amount (0), Late (image, 5), Matte (mask, -1000).
class Probe : public ThreadedOperator {
public:
    Probe(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        last = AddInputTagList(
            "Last", "Last",
            {{LinkDataType, CLSID_DataType_Number}, {InputPriority, PriorityLast}, {InputDefault, 2.0}});
        input = AddInputTagList("Input", "Input", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
        amount = AddInputTagList("Amount", "Amount", {{LinkDataType, CLSID_DataType_Number}, {InputDefault, 0.5}});
        late = AddInputTagList("Late", "Late",
                               {{LinkDataType, CLSID_DataType_Image}, {InputPriority, 5}, {InputRequired, 0}});
        matte = AddInputTagList(
            "Matte", "Matte", {{LinkDataType, CLSID_DataType_Mask}, {InputPriority, PriorityMask}, {InputRequired, 0}});
        output = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
        watched = {last, input, amount, late, matte};
    }

    Seen Snapshot(const Request *req) const {
        Seen s;
        s.pri = req->GetPri();
        s.precalc = req->IsPreCalc();
        for (const Input *in : watched) {
            s.hasData.push_back(req->GetInputData(in) != nullptr);
            s.roi.push_back(req->GetInputRoI(in));
            s.dod.push_back(req->GetInputDoD(in));
        }
        if (const AutoImageRoI roi(req); roi) s.reqRoI = *roi.Get();
        if (const AutoImageDoD dod(req); dod) s.outDoD = *dod.Get();
        if (auto *img = dynamic_cast<const Image *>(req->GetInputData(input))) {
            s.inputNoData = img->IsNoData();
            s.inputWindow = img->DataWindow();
        }
        return s;
    }

    void CheckRequest(Request *req) override {
        ThreadedOperator::CheckRequest(req);
        checks.push_back(Snapshot(req));
        if (onCheck) onCheck(*this, req);
    }

    void Process(Request *req) override {
        calls.push_back(Snapshot(req));
        if (!req->IsPreCalc()) seenInput = Ref<Image>(dynamic_cast<Image *>(req->GetInputData(input)));
        if (onProcess) {
            onProcess(*this, req);
            return;
        }
        MakeOutput(req);
    }

    /// The tool's own work: a fixed colour function of the main input (or of
    /// Late when Input was dropped) over the input's data window.
    void MakeOutput(Request *req) {
        auto *src = dynamic_cast<Image *>(req->GetInputData(input));
        if (!src) src = dynamic_cast<Image *>(req->GetInputData(late));
        if (!src) {
            Fail(req, "%s: nothing to work on\n", Name().c_str());
            req->SetOutputData(output, nullptr);
            return;
        }
        auto *k = dynamic_cast<const Number *>(req->GetInputData(amount));
        const float gain = k ? static_cast<float>(k->value) : 0.f;
        ImgRectI dw = src->DataWindow();
        if (const AutoImageRoI roi(req); roi) dw &= roi->rect;
        const FltPixel canvas = Color(src->GetCanvasColor(), gain);
        Ref<Image> img = NewImageTagList(
            {{ImgLikeImage, src}, {ImgDataWindow, &dw}, {ImgNoData, req->IsPreCalc()}, {ImgCanvasColor, &canvas}});
        if (!req->IsPreCalc() && !dw.IsNull()) {
            img->AllocScanLineData();
            DoMultiProcess(
                [&](int i) {
                    const int y = dw.y0 + i;
                    for (int x = dw.x0; x < dw.x1; ++x) img->PutFlt(x, y, Color(src->GetFlt(x, y), gain));
                },
                dw.Height());
        }
        req->SetOutputData(output, img.Get());
    }

    static FltPixel Color(const FltPixel &p, float gain) {
        return {p.R * gain + 0.125f, std::sqrt(std::fabs(p.G)), p.B * p.A, p.A};
    }

    std::vector<Seen> PixelChecks() const {
        std::vector<Seen> out;
        for (const Seen &s : checks)
            if (!s.precalc) out.push_back(s);
        return out;
    }
    std::vector<Seen> PreCalcChecks() const {
        std::vector<Seen> out;
        for (const Seen &s : checks)
            if (s.precalc) out.push_back(s);
        return out;
    }
    int PixelCalls() const {
        int n = 0;
        for (const Seen &s : calls) n += s.precalc ? 0 : 1;
        return n;
    }

    Input *last, *input, *amount, *late, *matte;
    Output *output;
    std::vector<Input *> watched;
    std::vector<Seen> checks, calls;
    Ref<Image> seenInput;
    std::function<void(Probe &, Request *)> onCheck, onProcess;
};

/// Index of each watched input in Seen's vectors, and its priority.
enum Watched { WLast, WInput, WAmount, WLate, WMatte, WCount };
constexpr int WatchedPriority[WCount] = {PriorityLast, PriorityImage, PriorityDefault, 5, PriorityMask};
constexpr bool WatchedIsImage[WCount] = {false, true, false, true, true};

/// A source that records the region of each pixel request.
class RoISource : public ThreadedOperator {
public:
    RoISource(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        output = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        if (req->IsPreCalc()) {
            const ImgRectI dw = image->DataWindow();
            req->SetOutputData(output,
                               NewImageTagList({{ImgLikeImage, image.Get()}, {ImgDataWindow, &dw}, {ImgNoData, 1}}));
            return;
        }
        rois.push_back(req->RoI());
        req->SetOutputData(output, image);
    }
    Ref<Image> image;
    Output *output;
    std::vector<std::optional<ImageDomain>> rois;
};

template <class T> Object *Make(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new T(reg, args, tags);
}

OvID Register(const char *id, ClassFactory make, std::initializer_list<TagItem> attrs) {
    TagList tags{
        {RegConstructor, make}, {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)}, {RegName, id}};
    for (const TagItem &a : attrs) tags.Set(a);
    Registry::_Init(&ClassRegistry, OvID(id), tags);
    return OvID(id);
}

struct Classes {
    OvID probe, probeNoRoI, probeNoDoD, probeCommon, roiSource;
    Classes() {
        probe = Register("EngineTestProbe", &Make<Probe>,
                         {{RegSupportsRoI, 1}, {RegSupportsDoD, 1}, {RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
        probeNoRoI = Register("EngineTestProbeNoRoI", &Make<Probe>,
                              {{RegSupportsDoD, 1}, {RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
        probeNoDoD = Register("EngineTestProbeNoDoD", &Make<Probe>,
                              {{RegSupportsRoI, 1}, {RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
        probeCommon = Register("EngineTestProbeCommon", &Make<Probe>, {{RegSupportsRoI, 1}, {RegSupportsDoD, 1}});
        roiSource = Register("EngineTestRoISource", &Make<RoISource>, {{RegSupportsRoI, 1}, {RegSupportsDoD, 1}});
    }
};
const Classes &C() {
    static const Classes classes;
    return classes;
}

Probe *AddProbe(OrvaneDoc &doc, const std::string &name, OvID cls = OvID()) {
    auto *p = dynamic_cast<Probe *>(doc.AddTool(cls.IsNull() ? C().probe : cls, name));
    EXPECT_NE(p, nullptr);
    return p;
}

/// An RGBA float image whose data window lies inside its frame, with a canvas.
Ref<Image> Windowed(int w, int h, const ImgRectI &dw, FltPixel canvas, unsigned seed = 3) {
    Ref<Image> full = ts::PatternImage(dw.Width(), dw.Height(), 8, seed);
    Ref<Image> img = NewImageTagList(
        {{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, 8}, {ImgDataWindow, &dw}, {ImgCanvasColor, &canvas}});
    img->AllocScanLineData();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) img->PutFlt(x, y, full->GetFlt(x - dw.x0, y - dw.y0));
    return img;
}

Ref<Image> MaskImage(int w, int h) {
    Ref<Image> m = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, 4}});
    m->AllocScanLineData();
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const float v = static_cast<float>((x + 2 * y) % 5) / 4.f;
            m->PutFlt(x, y, {v, v, v, v});
        }
    return m;
}

Ref<Image> Eval(Operator *op, double time = 0.0, EvalOptions opt = {}) {
    Ref<Parameter> p = Evaluate(op->FindMainOutput(), time, opt);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

/// A probe fed on all three image inputs: Input, Late and Matte.
struct Fed {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ts::ImageSourceTool *main = nullptr, *late = nullptr, *matte = nullptr;
    Probe *probe = nullptr;

    explicit Fed(OvID cls = OvID()) {
        main = ts::AddImageSource(*doc, "Main", ts::PatternImage(12, 8, 8, 1));
        late = ts::AddImageSource(*doc, "LateSrc", ts::PatternImage(12, 8, 8, 2));
        matte = ts::AddImageSource(*doc, "MatteSrc", MaskImage(12, 8));
        probe = AddProbe(*doc, "Probe1", cls);
        EXPECT_TRUE(probe->input->ConnectTo(main->Out()));
        EXPECT_TRUE(probe->late->ConnectTo(late->Out()));
        EXPECT_TRUE(probe->matte->ConnectTo(matte->Out()));
    }
};

// ---------------------------------------------------------------------------

TEST(Engine, InputsArriveLevelByLevelLowestFirst) {
    Fed f;
    ASSERT_TRUE(Eval(f.probe));
    const std::vector<int> levels{PriorityMask, PriorityImage, PriorityDefault, 5, PriorityLast};
    for (const bool precalc : {true, false}) {
        SCOPED_TRACE(precalc ? "pre-calculation walk" : "pixel walk");
        const std::vector<Seen> checks = precalc ? f.probe->PreCalcChecks() : f.probe->PixelChecks();
        ASSERT_EQ(checks.size(), levels.size()) << "one CheckRequest per level";
        for (size_t k = 0; k < levels.size(); ++k) {
            SCOPED_TRACE("level " + std::to_string(levels[k]));
            EXPECT_EQ(checks[k].pri, levels[k]);
            for (int w = 0; w < WCount; ++w) {
                // Lower levels have arrived; this level and the ones above have not.
                EXPECT_EQ(checks[k].hasData[w], WatchedPriority[w] < levels[k]) << "input " << w;
                // Image domains are known from this input's own level on.
                EXPECT_EQ(checks[k].dod[w].has_value(), WatchedIsImage[w] && WatchedPriority[w] <= levels[k])
                    << "input " << w;
            }
        }
    }
    // Process sees everything, with the values of the constants.
    ASSERT_EQ(f.probe->PixelCalls(), 1);
    const Seen &proc = f.probe->calls.back();
    for (int w = 0; w < WCount; ++w) EXPECT_TRUE(proc.hasData[w]) << "input " << w;
    EXPECT_EQ(f.main->processCount, 1);
    EXPECT_EQ(f.late->processCount, 1);
    EXPECT_EQ(f.matte->processCount, 1);
}

TEST(Engine, ConstantsArriveWithTheirValuesBeforeHigherLevels) {
    Fed f;
    std::vector<double> amountAtLast;
    f.probe->onCheck = [&](Probe &p, Request *req) {
        if (req->GetPri() == PriorityLast)
            if (auto *n = dynamic_cast<const Number *>(req->GetInputData(p.amount))) amountAtLast.push_back(n->value);
    };
    ts::SetNumber(f.probe, "Amount", 0.75);
    ASSERT_TRUE(Eval(f.probe));
    EXPECT_EQ(amountAtLast, (std::vector<double>{0.75, 0.75})); // pre-calculation and pixel walks
}

TEST(Engine, SettingInputDataToNullStopsTheFetch) {
    struct Case {
        const char *name;
        int level;       ///< the CheckRequest level that drops it
        Watched dropped; ///< the input dropped
    };
    const Case cases[] = {
        {"image at its own level", PriorityImage, WInput},
        {"image from an earlier level", PriorityMask, WLate},
        {"mask at its own level", PriorityMask, WMatte},
        {"late image at its own level", 5, WLate},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Fed f;
        f.probe->onCheck = [&](Probe &p, Request *req) {
            if (req->IsPreCalc() || req->GetPri() != c.level) return;
            req->SetInputData(p.watched[c.dropped], nullptr);
        };
        ASSERT_TRUE(Eval(f.probe));
        const Seen &proc = f.probe->calls.back();
        ASSERT_FALSE(proc.precalc);
        EXPECT_FALSE(proc.hasData[c.dropped]);
        EXPECT_EQ(f.main->processCount, c.dropped == WInput ? 0 : 1);
        EXPECT_EQ(f.late->processCount, c.dropped == WLate ? 0 : 1);
        EXPECT_EQ(f.matte->processCount, c.dropped == WMatte ? 0 : 1);
        EXPECT_TRUE(Lines(*f.doc).empty());
    }
}

TEST(Engine, SettingInputDataGivesTheValueWithoutFetching) {
    Fed f;
    Ref<Image> given = ts::PatternImage(12, 8, 8, 9);
    f.probe->onCheck = [&](Probe &p, Request *req) {
        if (req->GetPri() == PriorityImage) req->SetInputData(p.input, given.Get());
    };
    Ref<Image> out = Eval(f.probe);
    ASSERT_TRUE(out);
    EXPECT_EQ(f.probe->seenInput.Get(), given.Get());
    EXPECT_EQ(f.main->processCount, 0);
    // The result is the tool's function of the given image.
    EXPECT_EQ(out->GetFlt(3, 4), Probe::Color(given->GetFlt(3, 4), 0.5f));
}

TEST(Engine, RegionsOfInterestReachUpstream) {
    struct Case {
        const char *name;
        std::optional<ImgRectI> requested; ///< the asker's region
        std::optional<ImgRectI> narrowed;  ///< what CheckRequest sets on Input
        std::optional<ImgRectI> upstream;  ///< what the source must see
    };
    const Case cases[] = {
        {"whole frame", std::nullopt, std::nullopt, std::nullopt},
        {"default is the request's", ImgRectI(1, 2, 9, 6), std::nullopt, ImgRectI(1, 2, 9, 6)},
        {"narrowed", ImgRectI(1, 2, 9, 6), ImgRectI(3, 3, 5, 5), ImgRectI(3, 3, 5, 5)},
        {"narrowed from a whole frame", std::nullopt, ImgRectI(0, 0, 4, 4), ImgRectI(0, 0, 4, 4)},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        auto *src = dynamic_cast<RoISource *>(doc->AddTool(C().roiSource, "Src"));
        ASSERT_NE(src, nullptr);
        src->image = ts::PatternImage(12, 8);
        Probe *p = AddProbe(*doc, "Probe1");
        ASSERT_TRUE(p->input->ConnectTo(src->output));
        std::optional<ImageDomain> roiAtCheck;
        p->onCheck = [&](Probe &self, Request *req) {
            if (req->IsPreCalc() || req->GetPri() != PriorityImage) return;
            roiAtCheck = req->GetInputRoI(self.input);
            if (c.narrowed) {
                const ImageDomain d(*c.narrowed);
                req->SetInputRoI(self.input, &d);
            }
        };
        EvalOptions opt;
        if (c.requested) opt.roi = ImageDomain(*c.requested);
        ASSERT_TRUE(Eval(p, 0.0, opt));
        const std::optional<ImageDomain> requested =
            c.requested ? std::optional<ImageDomain>(ImageDomain(*c.requested)) : std::nullopt;
        const std::optional<ImageDomain> upstream =
            c.upstream ? std::optional<ImageDomain>(ImageDomain(*c.upstream)) : std::nullopt;
        EXPECT_EQ(D(roiAtCheck), D(requested)) << "the default region of an input is the request's";
        ASSERT_EQ(src->rois.size(), 1u);
        EXPECT_EQ(D(src->rois[0]), D(upstream));
        const Seen &proc = p->calls.back();
        EXPECT_EQ(D(proc.reqRoI), D(requested));
        EXPECT_EQ(D(proc.roi[WInput]), D(upstream));
    }
}

TEST(Engine, AToolWithoutRoISupportGetsNoRegion) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    auto *src = dynamic_cast<RoISource *>(doc->AddTool(C().roiSource, "Src"));
    ASSERT_NE(src, nullptr);
    src->image = ts::PatternImage(12, 8);
    Probe *p = AddProbe(*doc, "Probe1", C().probeNoRoI);
    ASSERT_TRUE(p->input->ConnectTo(src->output));
    EvalOptions opt;
    opt.roi = ImageDomain(ImgRectI(2, 2, 5, 5));
    Ref<Image> out = Eval(p, 0.0, opt);
    ASSERT_TRUE(out);
    for (const Seen &s : p->checks) EXPECT_EQ(D(s.roi[WInput]), "none");
    EXPECT_EQ(D(p->calls.back().reqRoI), "none");
    ASSERT_EQ(src->rois.size(), 1u);
    EXPECT_EQ(D(src->rois[0]), "none");
    EXPECT_EQ(R(out->DataWindow()), R(ImgRectI(0, 0, 12, 8)));
}

TEST(Engine, PreCalculationMakesWindowsWithoutPixels) {
    Fed f;
    // The source's windows: a data window inside the frame.
    const ImgRectI dw(2, 1, 9, 7);
    f.main->SetImage(Windowed(12, 8, dw, {0.25f, 0.5f, 0.f, 0.5f}));
    EvalOptions pre;
    pre.flags = ReqFlagPreCalc;
    Ref<Image> shape = Eval(f.probe, 0.0, pre);
    ASSERT_TRUE(shape);
    EXPECT_TRUE(shape->IsNoData());
    EXPECT_FALSE(shape->HasScanLineData());
    EXPECT_EQ(R(shape->DataWindow()), R(dw));
    EXPECT_EQ(shape->Width(), 12);
    EXPECT_EQ(shape->Height(), 8);
    EXPECT_EQ(shape->GetCanvasColor(), Probe::Color({0.25f, 0.5f, 0.f, 0.5f}, 0.5f));
    EXPECT_EQ(f.main->processCount, 0);
    EXPECT_EQ(f.late->processCount, 0);
    EXPECT_EQ(f.matte->processCount, 0);
    ASSERT_EQ(f.probe->calls.size(), 1u);
    EXPECT_TRUE(f.probe->calls[0].precalc);
    EXPECT_TRUE(f.probe->calls[0].inputNoData) << "inputs of a pre-calculation carry no data";
    EXPECT_EQ(R(f.probe->calls[0].inputWindow), R(dw));
}

TEST(Engine, EveryPixelRequestFollowsAPreCalculation) {
    // The tool chooses a data window of its own; the pixel pass must know it
    // as the output's domain before Process runs.
    const ImgRectI own(1, 2, 5, 7);
    for (const bool withRoI : {false, true}) {
        SCOPED_TRACE(withRoI ? "region request" : "whole frame");
        Fed f;
        f.probe->onProcess = [&](Probe &p, Request *req) {
            auto *src = dynamic_cast<Image *>(req->GetInputData(p.input));
            ImgRectI dw = own;
            if (const AutoImageRoI roi(req); roi) dw &= roi->rect;
            Ref<Image> img =
                NewImageTagList({{ImgLikeImage, src}, {ImgDataWindow, &dw}, {ImgNoData, req->IsPreCalc()}});
            if (!req->IsPreCalc()) img->Fill({1, 1, 1, 1});
            req->SetOutputData(p.output, img.Get());
        };
        EvalOptions opt;
        if (withRoI) opt.roi = ImageDomain(ImgRectI(0, 0, 3, 3));
        Ref<Image> out = Eval(f.probe, 0.0, opt);
        ASSERT_TRUE(out);
        ASSERT_EQ(f.probe->calls.size(), 2u);
        EXPECT_TRUE(f.probe->calls[0].precalc);
        EXPECT_EQ(D(f.probe->calls[0].reqRoI), "none") << "pre-calculation covers the whole domain";
        EXPECT_FALSE(f.probe->calls[1].precalc);
        EXPECT_EQ(D(f.probe->calls[1].outDoD), R(own));
        EXPECT_EQ(R(out->DataWindow()), R(withRoI ? own & ImgRectI(0, 0, 3, 3) : own));
    }
}

TEST(Engine, AToolWithoutDoDSupportGetsWholeFrames) {
    struct Case {
        const char *name;
        OvID cls;
        ImgRectI sourceWindow;
        ImgRectI seenWindow;
    };
    const FltPixel canvas{0.1f, 0.2f, 0.3f, 0.4f};
    const Case cases[] = {
        {"domains: inside the frame", C().probe, ImgRectI(2, 3, 6, 7), ImgRectI(2, 3, 6, 7)},
        {"whole frames: inside the frame", C().probeNoDoD, ImgRectI(2, 3, 6, 7), ImgRectI(0, 0, 10, 8)},
        {"whole frames: across the frame", C().probeNoDoD, ImgRectI(-2, -1, 4, 5), ImgRectI(-2, -1, 10, 8)},
        {"whole frames: already covering", C().probeNoDoD, ImgRectI(-1, -1, 11, 9), ImgRectI(-1, -1, 11, 9)},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        Ref<Image> srcImg = Windowed(10, 8, c.sourceWindow, canvas);
        ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", srcImg);
        Probe *p = AddProbe(*doc, "Probe1", c.cls);
        ASSERT_TRUE(p->input->ConnectTo(src->Out()));
        ASSERT_TRUE(Eval(p));
        ASSERT_EQ(p->calls.size(), 2u);
        for (const Seen &s : p->calls) {
            EXPECT_EQ(R(s.inputWindow), R(c.seenWindow)) << (s.precalc ? "pre-calculation" : "pixels");
            EXPECT_EQ(D(s.dod[WInput]), R(c.seenWindow));
            EXPECT_EQ(s.inputNoData, s.precalc);
        }
        // The canvas made real: the source's pixels inside its window, its
        // canvas colour elsewhere.
        ASSERT_TRUE(p->seenInput);
        const ImgRectI seen = p->seenInput->DataWindow();
        for (int y = seen.y0; y < seen.y1; ++y)
            for (int x = seen.x0; x < seen.x1; ++x) {
                const FltPixel want = c.sourceWindow.Contains(x, y) ? srcImg->GetFlt(x, y) : canvas;
                ASSERT_EQ(p->seenInput->GetFlt(x, y), want) << x << "," << y;
            }
    }
}

TEST(Engine, AFailingToolStopsTheChainWithItsOneLine) {
    struct Case {
        const char *name;
        bool failInPreCalc;
        Watched feeds; ///< which input of the downstream probe the failing tool feeds
        const char *line;
    };
    const Case cases[] = {
        {"pixels, main input", false, WInput, "Bad: cannot go on at time 2"},
        {"pre-calculation too", true, WInput, "Bad: cannot go on at time 2"},
        {"optional image input", false, WLate, "Bad: cannot go on at time 2"},
        {"optional mask input", false, WMatte, "Bad: cannot go on at time 2"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", ts::PatternImage(12, 8));
        Probe *bad = AddProbe(*doc, "Bad");
        Probe *down = AddProbe(*doc, "Down");
        ASSERT_TRUE(bad->input->ConnectTo(src->Out()));
        ASSERT_TRUE(down->input->ConnectTo(src->Out()));
        ASSERT_TRUE(down->watched[c.feeds]->ConnectTo(bad->output));
        bad->onProcess = [&](Probe &p, Request *req) {
            if (req->IsPreCalc() && !c.failInPreCalc) return p.MakeOutput(req);
            doc->PrintF(req, ConsoleError, "%s: cannot go on at time %g\n", p.Name().c_str(), req->Time());
            req->SetOutputData(p.output, nullptr);
        };
        EXPECT_FALSE(Eval(down, 2.0));
        const std::vector<ConsoleLine> lines = Lines(*doc);
        ASSERT_EQ(lines.size(), 1u);
        EXPECT_EQ(lines[0].text, c.line);
        EXPECT_EQ(lines[0].code, ConsoleError);
        EXPECT_EQ(down->PixelCalls(), 0);
    }
}

TEST(Engine, AToolThatGivesNothingFailsWithOneHostLine) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", ts::PatternImage(12, 8));
    Probe *silent = AddProbe(*doc, "Silent");
    ASSERT_TRUE(silent->input->ConnectTo(src->Out()));
    silent->onProcess = [](Probe &p, Request *req) {
        if (req->IsPreCalc()) p.MakeOutput(req);
    };
    EXPECT_FALSE(Eval(silent, 4.0));
    const std::vector<ConsoleLine> lines = Lines(*doc);
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].text.rfind("Silent", 0), 0u) << lines[0].text;
}

TEST(Engine, AnUnconnectedRequiredImageFailsNamingTheInput) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", ts::PatternImage(12, 8));
    Probe *p = AddProbe(*doc, "Lonely1");
    ASSERT_TRUE(p->late->ConnectTo(src->Out())); // the tool could work from Late alone
    EXPECT_FALSE(Eval(p));
    const std::vector<ConsoleLine> lines = Lines(*doc);
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].code, ConsoleError);
    EXPECT_NE(lines[0].text.find("Lonely1"), std::string::npos) << lines[0].text;
    EXPECT_NE(lines[0].text.find("\"Input\""), std::string::npos) << lines[0].text;
    EXPECT_TRUE(p->calls.empty());

    // Optional inputs may stay unconnected.
    doc->ClearConsole();
    ASSERT_TRUE(p->input->ConnectTo(src->Out()));
    p->late->Disconnect();
    EXPECT_TRUE(Eval(p));
    EXPECT_TRUE(Lines(*doc).empty());
}

TEST(Engine, RunningOutOfMemoryGivesTheOutOfMemoryLine) {
    struct Case {
        const char *name;
        bool inChunk;
        bool downstream; ///< evaluate a tool below the failing one
    };
    const Case cases[] = {
        {"in Process", false, false},
        {"in a chunk", true, false},
        {"seen from downstream", false, true},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", ts::PatternImage(12, 8));
        Probe *p = AddProbe(*doc, "Greedy1");
        Probe *down = AddProbe(*doc, "Down1");
        ASSERT_TRUE(p->input->ConnectTo(src->Out()));
        ASSERT_TRUE(down->input->ConnectTo(p->output));
        p->onProcess = [&](Probe &self, Request *req) {
            if (req->IsPreCalc()) return self.MakeOutput(req);
            if (!c.inChunk) throw std::bad_alloc();
            self.DoMultiProcess(
                [](int i) {
                    if (i == 3) throw std::bad_alloc();
                },
                8);
            self.MakeOutput(req);
        };
        EXPECT_FALSE(Eval(c.downstream ? down : p, 3.0));
        const std::vector<ConsoleLine> lines = Lines(*doc);
        ASSERT_EQ(lines.size(), 1u);
        EXPECT_EQ(lines[0].text, "Greedy1: out of memory (time = 3.000000)");
        EXPECT_EQ(lines[0].code, ConsoleError);
    }
}

TEST(Engine, AnAbortedRenderReturnsNullSilently) {
    enum Where { Before, UpstreamProcess, OwnCheck, OwnProcess };
    const std::pair<const char *, Where> cases[] = {
        {"before the render", Before},
        {"in an upstream tool", UpstreamProcess},
        {"in CheckRequest", OwnCheck},
        {"in Process, after the output was set", OwnProcess},
    };
    for (const auto &c : cases) {
        const Where where = c.second; // a plain variable, captured by the lambdas below
        SCOPED_TRACE(c.first);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", ts::PatternImage(12, 8));
        Probe *up = AddProbe(*doc, "Up");
        Probe *p = AddProbe(*doc, "Own");
        ASSERT_TRUE(up->input->ConnectTo(src->Out()));
        ASSERT_TRUE(p->input->ConnectTo(up->output));
        RenderTask task;
        if (where == Before) task.Abort();
        auto abortIn = [](Where at, Where here, Request *req) {
            if (at == here && !req->IsPreCalc() && req->GetTask()) req->GetTask()->Abort();
        };
        up->onProcess = [&](Probe &self, Request *req) {
            abortIn(where, UpstreamProcess, req);
            self.MakeOutput(req);
        };
        p->onCheck = [&](Probe &, Request *req) { abortIn(where, OwnCheck, req); };
        p->onProcess = [&](Probe &self, Request *req) {
            self.MakeOutput(req);
            abortIn(where, OwnProcess, req);
        };
        EvalOptions opt;
        opt.task = &task;
        EXPECT_FALSE(Eval(p, 0.0, opt));
        EXPECT_TRUE(task.IsAborted());
        EXPECT_TRUE(Lines(*doc).empty());
        // Nothing half-made was kept: a render without the task works.
        Ref<Image> out = Eval(p);
        ASSERT_TRUE(out);
        EXPECT_FALSE(out->IsNoData());
        EXPECT_TRUE(Lines(*doc).empty());
    }
}

/// Every byte of every row of the data window.
std::vector<uint8_t> Bytes(const Image &img) {
    std::vector<uint8_t> out;
    for (int y = img.DataWindow().y0; y < img.DataWindow().y1; ++y)
        out.insert(out.end(), img.ScanLine(y), img.ScanLine(y) + img.RowBytes());
    return out;
}

TEST(Engine, ResultsAreBitIdenticalForAnyWorkerCount) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", ts::PatternImage(97, 61, 8, 5));
    ts::ImageSourceTool *mask = ts::AddImageSource(*doc, "MaskSrc", ts::PatternImage(97, 61, 8, 6));
    Probe *a = AddProbe(*doc, "A", C().probeCommon);
    Probe *b = AddProbe(*doc, "B", C().probeCommon);
    ASSERT_TRUE(a->input->ConnectTo(src->Out()));
    ASSERT_TRUE(b->input->ConnectTo(a->output));
    ASSERT_TRUE(a->FindInput("EffectMask")->ConnectTo(mask->Out()));
    ts::SetNumber(a, "Blend", 0.6);
    ts::SetNumber(a, "EffectMaskChannel", 4);
    ts::SetNumber(b, "Amount", 1.7);
    ts::SetNumber(b, "ProcessGreen", 0);
    ts::SetNumber(b, "Blend", 0.35);

    const int before = WorkerCount();
    EvalOptions opt;
    opt.useCache = false;
    std::vector<std::vector<uint8_t>> runs;
    for (const int workers : {1, 4, 3, 1}) {
        SetWorkerCount(workers);
        Ref<Image> out = Eval(b, 0.0, opt);
        ASSERT_TRUE(out);
        runs.push_back(Bytes(*out));
    }
    SetWorkerCount(before);
    EXPECT_EQ(WorkerCount(), before);
    ASSERT_FALSE(runs[0].empty());
    for (size_t i = 1; i < runs.size(); ++i) EXPECT_TRUE(runs[i] == runs[0]) << "run " << i;
}

} // namespace
} // namespace Orvane::enginetest
