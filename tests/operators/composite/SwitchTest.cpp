// The switches: which input is handed on (the very object, for images, 3D
// values and pending transforms alike), that the others are not rendered,
// the failures with their console lines, and how positions grow and survive
// a document round trip.
#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::switchtest {
namespace ts = ::Orvane::Test;
namespace {

/// A value of a non-image data type (3D scene, material, pending transform)
/// as the switches see it: something to hand on, nothing to look into.
class OpaqueValue : public Parameter {
public:
    explicit OpaqueValue(OvID type) : type_(type) {}
    OvID DataType() const override { return type_; }
    ScriptVal ToScript() const override { return ScriptVal(); }
    bool Equals(const Parameter &other) const override { return &other == this; }
    uint64_t Hash() const override { return reinterpret_cast<uintptr_t>(this); }
    Ref<Parameter> Copy() const override { return MakeRef<OpaqueValue>(type_); }

private:
    OvID type_;
};

/// Outputs one OpaqueValue of the type its class names, counting requests.
class ValueSource : public ThreadedOperator {
public:
    ValueSource(const Registry *reg, const ScriptVal &args, const TagList &tags, OvID type)
        : ThreadedOperator(reg, args, tags), value(MakeRef<OpaqueValue>(type)) {
        output = AddOutputTagList("Output", "Output", {{LinkDataType, type}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        if (!req->IsPreCalc()) ++processCount;
        req->SetOutputData(output, value);
    }
    Ref<OpaqueValue> value;
    Output *output;
    int processCount = 0;
};

/// Takes an image or a pending transform and remembers what it was given.
class Probe : public ThreadedOperator {
public:
    Probe(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        input = AddInputTagList("Input", "Input",
                                {{LinkDataType, CLSID_DataType_Image},
                                 {LinkSecondDataType, CLSID_DataType_TransformMatrix},
                                 {LinkMain, 1}});
        output = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        if (!req->IsPreCalc()) received = Ref<Parameter>(req->GetInputData(input));
        req->SetOutputData(output, req->GetInputData(input));
    }
    Input *input;
    Output *output;
    Ref<Parameter> received;
};

template <class T> OvID Register(const char *id, ClassFactory make) {
    TagList tags{{RegConstructor, make},       {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)},
                 {RegNoBlendControls, 1},      {RegNoEffectMask, 1},
                 {RegNoMotionBlurControls, 1}, {RegSupportsRoI, 1},
                 {RegSupportsDoD, 1}};
    Registry::_Init(&ClassRegistry, OvID(id), tags);
    return OvID(id);
}

struct Classes {
    OvID scene = Register<ValueSource>("TestSwitchScene", [](const Registry *r, const ScriptVal &a, const TagList &t) {
        return static_cast<Object *>(new ValueSource(r, a, t, CLSID_DataType_3D));
    });
    OvID material =
        Register<ValueSource>("TestSwitchMaterial", [](const Registry *r, const ScriptVal &a, const TagList &t) {
            return static_cast<Object *>(new ValueSource(r, a, t, CLSID_DataType_MtlGraph3D));
        });
    OvID transform =
        Register<ValueSource>("TestSwitchTransform", [](const Registry *r, const ScriptVal &a, const TagList &t) {
            return static_cast<Object *>(new ValueSource(r, a, t, CLSID_DataType_TransformMatrix));
        });
    OvID probe = Register<Probe>("TestSwitchProbe", [](const Registry *r, const ScriptVal &a, const TagList &t) {
        return static_cast<Object *>(new Probe(r, a, t));
    });
};
const Classes &C() {
    static const Classes classes;
    return classes;
}

class SwitchTest : public ::testing::Test {
protected:
    void SetUp() override { ts::LoadOperators(); }

    /// A Switch of `n` inputs, each linked to a source of its own with a
    /// different image (position i: a w x h pattern moved by i pixels).
    Operator *MakeSwitch(int n) {
        Operator *sw = doc->AddTool(OvID("Switch"), "Switch1");
        EXPECT_NE(sw, nullptr);
        if (!sw) return nullptr;
        ts::SetNumber(sw, "NumberOfInputs", n);
        for (int i = 0; i < n; ++i) {
            Ref<Image> img = ts::PatternImage(8, 6, 8, 10 + i);
            const ImgRectI dw(i, 0, 8 + i, 6);
            Ref<Image> moved = NewImageTagList({{ImgLikeImage, img.Get()}, {ImgDataWindow, &dw}});
            moved->AllocScanLineData();
            for (int y = 0; y < 6; ++y)
                for (int x = 0; x < 8; ++x) moved->PutFlt(x + i, y, img->GetFlt(x, y));
            ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src" + std::to_string(i), moved);
            sources.push_back(src);
            images.push_back(moved);
            Input *in = sw->FindInput(("Input" + std::to_string(i)).c_str());
            EXPECT_NE(in, nullptr) << i;
            if (in) {
                EXPECT_TRUE(in->ConnectTo(src->Out()));
            }
        }
        return sw;
    }

    /// Evaluates without the result cache, so every request really runs.
    static Ref<Parameter> Eval(Operator *op, double time = 0.0, uint32_t flags = 0) {
        EvalOptions opt;
        opt.useCache = false;
        opt.flags = flags;
        return Evaluate(op->FindMainOutput(), time, opt);
    }

    std::vector<int> Counts() const {
        std::vector<int> c;
        for (const auto *s : sources) c.push_back(s->processCount);
        return c;
    }

    std::vector<std::string> Lines() const {
        std::vector<std::string> lines;
        for (const ConsoleLine &l : doc->ConsoleLines()) {
            EXPECT_EQ(l.code, ConsoleError);
            lines.push_back(l.text);
        }
        return lines;
    }

    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    std::vector<ts::ImageSourceTool *> sources;
    std::vector<Ref<Image>> images; ///< what each source outputs
};

TEST_F(SwitchTest, TheSwitchesDeriveFromAnAbstractBase) {
    const Registry *base = ClassRegistry->Find(OvID("SwitchBase"));
    ASSERT_NE(base, nullptr);
    EXPECT_FALSE(base->CanCreate());
    EXPECT_EQ(doc->AddTool(OvID("SwitchBase")), nullptr);
    long long kinds = 0;
    for (const char *id : {"Switch", "Switch3D", "MtlSwitch3D"}) {
        const Registry *row = ClassRegistry->Find(OvID(id));
        ASSERT_NE(row, nullptr) << id;
        EXPECT_EQ(row->Base(), base) << id;
        EXPECT_TRUE(row->Tags().GetBool(RegSwitchClass)) << id;
        kinds |= 1ll << row->Tags().GetLong(RegSwitchDataKind, 8);
    }
    EXPECT_EQ(kinds, 0b111) << "data kinds 0, 1 and 2, one each";
}

TEST_F(SwitchTest, HandsOnTheChosenImageItselfAndRendersNothingElse) {
    Operator *sw = MakeSwitch(3);
    ASSERT_NE(sw, nullptr);
    EXPECT_FALSE(sw->IsPlaceholder());
    // Source is rounded half up: each value and the position it picks.
    const struct {
        double source;
        int chosen;
    } cases[] = {{0, 0}, {2, 2}, {1, 1}, {0.49, 0}, {1.5, 2}, {-0.4, 0}, {1.2, 1}};
    for (const auto &c : cases) {
        SCOPED_TRACE(c.source);
        ts::SetNumber(sw, "Source", c.source);
        const std::vector<int> before = Counts();
        Ref<Parameter> out = Eval(sw);
        ASSERT_NE(out, nullptr);
        EXPECT_EQ(out.Get(), images[c.chosen].Get()) << "the switch hands on its input's object, not a copy";
        const std::vector<int> after = Counts();
        for (int i = 0; i < 3; ++i) EXPECT_EQ(after[i] - before[i], i == c.chosen ? 1 : 0) << "source " << i;
        EXPECT_TRUE(Lines().empty());
    }
}

TEST_F(SwitchTest, PreCalculationGivesTheChosenInputsWindows) {
    Operator *sw = MakeSwitch(3);
    ASSERT_NE(sw, nullptr);
    for (int i = 0; i < 3; ++i) {
        ts::SetNumber(sw, "Source", i);
        Ref<Parameter> shape = Eval(sw, 0.0, ReqFlagPreCalc);
        auto *img = dynamic_cast<Image *>(shape.Get());
        ASSERT_NE(img, nullptr);
        EXPECT_TRUE(img->IsNoData());
        EXPECT_EQ(img->DataWindow(), ImgRectI(i, 0, 8 + i, 6)) << i;
    }
    // A region of interest reaches the chosen input unchanged: its pixels
    // come back for exactly that region.
    ts::SetNumber(sw, "Source", 2);
    const ImgRectI roi(3, 1, 6, 4);
    Ref<Image> part = ts::EvalImage(sw, 0.0, &roi);
    ASSERT_NE(part, nullptr);
    for (int y = roi.y0; y < roi.y1; ++y)
        for (int x = roi.x0; x < roi.x1; ++x) {
            EXPECT_EQ(part->GetFlt(x, y), images[2]->GetFlt(x, y)) << x << "," << y;
        }
}

TEST_F(SwitchTest, WithSkipRoIEveryInputIsFetched) {
    // CheckRequest must leave the request alone: all inputs render, and the
    // result is still the chosen one.
    Operator *sw = MakeSwitch(3);
    ASSERT_NE(sw, nullptr);
    ts::SetNumber(sw, "Source", 1);
    Ref<Parameter> out = Eval(sw, 0.0, ReqFlagSkipRoI);
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out.Get(), images[1].Get());
    EXPECT_EQ(Counts(), (std::vector<int>{1, 1, 1}));
}

TEST_F(SwitchTest, ASourceOutsideTheInputsFailsWithOneLine) {
    Operator *sw = MakeSwitch(3);
    ASSERT_NE(sw, nullptr);
    const struct {
        double source, time;
        const char *line;
    } cases[] = {
        {3, 0,
         "Switch1 failed at time 0.0 - the switch tool tried to switch to a non-existant input 3 (currently "
         "inputs only exist for the range [0, 2])"},
        {-1, 12.3,
         "Switch1 failed at time 12.3 - the switch tool tried to switch to a non-existant input -1 "
         "(currently inputs only exist for the range [0, 2])"},
        {-0.5, 4,
         "Switch1 failed at time 4.0 - the switch tool tried to switch to a non-existant input 0 "
         "(currently inputs only exist for the range [0, 2])"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.source);
        ts::SetNumber(sw, "Source", c.source);
        doc->ClearConsole();
        const std::vector<int> before = Counts();
        Ref<Parameter> out = Eval(sw, c.time);
        if (c.source == -0.5) {
            // -0.5 rounds up to 0: a valid choice, no failure.
            EXPECT_NE(out, nullptr);
            EXPECT_TRUE(Lines().empty());
            continue;
        }
        EXPECT_EQ(out, nullptr);
        EXPECT_EQ(Lines(), std::vector<std::string>{c.line});
        EXPECT_EQ(Counts(), before) << "a failing switch renders none of its inputs";
    }
    // Fewer inputs than positions made: the range follows NumberOfInputs.
    ts::SetNumber(sw, "NumberOfInputs", 2);
    ts::SetNumber(sw, "Source", 2);
    doc->ClearConsole();
    EXPECT_EQ(Eval(sw), nullptr);
    EXPECT_EQ(Lines(), std::vector<std::string>{"Switch1 failed at time 0.0 - the switch tool tried to switch to a "
                                                "non-existant input 2 (currently inputs only exist for the range "
                                                "[0, 1])"});
}

TEST_F(SwitchTest, AnUnconnectedChoiceFailsInPreCalculation) {
    Operator *sw = MakeSwitch(2);
    ASSERT_NE(sw, nullptr);
    ts::SetNumber(sw, "NumberOfInputs", 3); // Input2 exists but is not linked
    ts::SetNumber(sw, "Source", 2);
    EXPECT_EQ(Eval(sw, 7.0), nullptr);
    EXPECT_EQ(Lines(), std::vector<std::string>{"Switch1.Input2 failed at time 7.0 - unconnected input"});
    doc->ClearConsole();
    EXPECT_EQ(Eval(sw, 7.0, ReqFlagPreCalc), nullptr);
    EXPECT_EQ(Lines(), std::vector<std::string>{"Switch1.Input2 failed at time 7.0 - unconnected input"});
    // An unconnected input that is not chosen is no failure.
    ts::SetNumber(sw, "Source", 1);
    doc->ClearConsole();
    EXPECT_NE(Eval(sw, 7.0), nullptr);
    EXPECT_TRUE(Lines().empty());
}

TEST_F(SwitchTest, PositionsGrowHideAndSurviveADocument) {
    Operator *sw = doc->AddTool(OvID("Switch"), "Switch1");
    ASSERT_NE(sw, nullptr);
    auto positions = [](Operator *op) {
        int n = 0;
        while (op->FindInput(("Input" + std::to_string(n)).c_str())) ++n;
        return n;
    };
    EXPECT_EQ(positions(sw), 2);
    Input *source = sw->FindInput("Source");
    ASSERT_NE(source, nullptr);
    EXPECT_EQ(source->Priority(), sw->FindInput("Input0")->Priority() - 1) << "Source is known when inputs are chosen";
    for (int i = 0; i < 2; ++i) {
        Input *in = sw->FindInput(("Input" + std::to_string(i)).c_str());
        EXPECT_EQ(in->MainIndex(), i + 1);
        EXPECT_EQ(in->DataType(), CLSID_DataType_Image);
        EXPECT_EQ(in->Tags().GetID(LinkSecondDataType), CLSID_DataType_TransformMatrix);
        EXPECT_FALSE(in->IsRequired());
        Input *name = sw->FindInput(("Name" + std::to_string(i)).c_str());
        ASSERT_NE(name, nullptr);
        EXPECT_STREQ(name->Label(), ("Name " + std::to_string(i)).c_str());
        EXPECT_EQ(name->DataType(), CLSID_DataType_Text);
    }

    ts::SetNumber(sw, "NumberOfInputs", 5);
    EXPECT_EQ(positions(sw), 5);
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Late", ts::PatternImage(4, 4));
    ASSERT_TRUE(sw->FindInput("Input4")->ConnectTo(src->Out()));
    ASSERT_TRUE(sw->FindInput("Name4")->SetValue(MakeRef<Text>("late one")));
    ts::SetNumber(sw, "Source", 4);
    Ref<Image> before = ts::EvalImage(sw);
    ASSERT_NE(before, nullptr);

    // Lowering the count hides positions; they keep their links.
    ts::SetNumber(sw, "NumberOfInputs", 3);
    EXPECT_EQ(positions(sw), 5);
    EXPECT_EQ(sw->FindInput("Input2")->IsVisible(), true);
    EXPECT_EQ(sw->FindInput("Input3")->IsVisible(), false);
    EXPECT_EQ(sw->FindInput("Name4")->IsVisible(), false);
    EXPECT_EQ(sw->FindInput("Input4")->Link(), src->Out());
    ts::SetNumber(sw, "NumberOfInputs", 5);
    EXPECT_EQ(sw->FindInput("Input4")->IsVisible(), true);
    EXPECT_EQ(positions(sw), 5);

    // Saved and read back: the positions come back before their links.
    const std::string text = SaveDocument(*doc);
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    const DocumentLoadResult loaded = LoadDocument(text, *again);
    ASSERT_TRUE(loaded.ok) << loaded.error;
    EXPECT_TRUE(loaded.warnings.empty()) << loaded.warnings.front();
    auto *late = dynamic_cast<ts::ImageSourceTool *>(again->FindTool("Late"));
    ASSERT_NE(late, nullptr);
    late->SetImage(ts::PatternImage(4, 4));
    Operator *sw2 = again->FindTool("Switch1");
    ASSERT_NE(sw2, nullptr);
    EXPECT_EQ(positions(sw2), 5);
    ASSERT_NE(sw2->FindInput("Input4")->Link(), nullptr);
    EXPECT_EQ(sw2->FindInput("Input4")->Link()->Owner()->Name(), "Late");
    EXPECT_EQ(dynamic_cast<const Text &>(*sw2->FindInput("Name4")->Constant()).value, "late one");
    EXPECT_EQ(SaveDocument(*again), text);
    Ref<Image> after = ts::EvalImage(sw2);
    ASSERT_NE(after, nullptr);
    EXPECT_EQ(after->DataWindow(), before->DataWindow());
    EXPECT_EQ(after->GetFlt(2, 3), before->GetFlt(2, 3));
}

TEST_F(SwitchTest, TheThreeDSwitchesHandOnTheirValues) {
    const struct {
        const char *cls;
        OvID source;
        OvID type;
    } cases[] = {{"Switch3D", C().scene, CLSID_DataType_3D}, {"MtlSwitch3D", C().material, CLSID_DataType_MtlGraph3D}};
    for (const auto &c : cases) {
        SCOPED_TRACE(c.cls);
        Operator *sw = doc->AddTool(OvID(c.cls));
        ASSERT_NE(sw, nullptr);
        EXPECT_EQ(sw->FindMainOutput()->DataType(), c.type);
        std::vector<ValueSource *> values;
        for (int i = 0; i < 2; ++i) {
            auto *v = dynamic_cast<ValueSource *>(doc->AddTool(c.source));
            ASSERT_NE(v, nullptr);
            values.push_back(v);
            ASSERT_TRUE(sw->FindInput(("Input" + std::to_string(i)).c_str())->ConnectTo(v->output));
        }
        // An image cannot be linked where a 3D value is expected.
        ts::ImageSourceTool *img = ts::AddImageSource(*doc, std::string("Img") + c.cls, ts::PatternImage(2, 2));
        EXPECT_FALSE(sw->FindInput("Input0")->ConnectTo(img->Out()));

        for (int chosen : {1, 0}) {
            ts::SetNumber(sw, "Source", chosen);
            const int counts[2] = {values[0]->processCount, values[1]->processCount};
            Ref<Parameter> out = Eval(sw);
            ASSERT_NE(out, nullptr);
            EXPECT_EQ(out.Get(), values[chosen]->value.Get());
            EXPECT_EQ(values[chosen]->processCount, counts[chosen] + 1);
            EXPECT_EQ(values[1 - chosen]->processCount, counts[1 - chosen]) << "the other value is not asked for";
        }
        // Without pre-calculation the 3D switches report an unlinked choice
        // in their one pass.
        sw->FindInput("Input1")->Disconnect();
        ts::SetNumber(sw, "Source", 1);
        doc->ClearConsole();
        EXPECT_EQ(Eval(sw, 3.0), nullptr);
        EXPECT_EQ(Lines(), std::vector<std::string>{sw->Name() + ".Input1 failed at time 3.0 - unconnected input"});
        doc->ClearConsole();
    }
}

TEST_F(SwitchTest, APendingTransformPassesThroughUnflattened) {
    Operator *sw = doc->AddTool(OvID("Switch"), "Switch1");
    ASSERT_NE(sw, nullptr);
    auto *xf = dynamic_cast<ValueSource *>(doc->AddTool(C().transform));
    ASSERT_NE(xf, nullptr);
    ts::ImageSourceTool *img = ts::AddImageSource(*doc, "Plain", ts::PatternImage(4, 3));
    ASSERT_TRUE(sw->FindInput("Input0")->ConnectTo(xf->output));
    ASSERT_TRUE(sw->FindInput("Input1")->ConnectTo(img->Out()));
    auto *probe = dynamic_cast<Probe *>(doc->AddTool(C().probe));
    ASSERT_NE(probe, nullptr);
    ASSERT_TRUE(probe->input->ConnectTo(sw->FindMainOutput()));

    ts::SetNumber(sw, "Source", 0);
    Eval(probe);
    EXPECT_EQ(probe->received.Get(), xf->value.Get());
    ts::SetNumber(sw, "Source", 1);
    Eval(probe);
    ASSERT_NE(probe->received, nullptr);
    EXPECT_EQ(probe->received.Get(), ts::EvalImage(img).Get());
}

} // namespace
} // namespace Orvane::switchtest
