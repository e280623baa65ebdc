// The switches: the very object of the chosen input handed on (images, 3D values, pending transforms), the
// others not rendered, failures with their console lines, positions growing and surviving a document.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
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

/// A ValueSource class for each data type.
template <OvID const &Type> Object *NewValueSource(const Registry *r, const ScriptVal &a, const TagList &t) {
    return new ValueSource(r, a, t, Type);
}
struct Classes {
    OvID scene = ts::RegisterTestTool("TestSwitchScene", &NewValueSource<CLSID_DataType_3D>);
    OvID material = ts::RegisterTestTool("TestSwitchMaterial", &NewValueSource<CLSID_DataType_MtlGraph3D>);
    OvID transform = ts::RegisterTestTool("TestSwitchTransform", &NewValueSource<CLSID_DataType_TransformMatrix>);
};
const Classes &C() {
    static const Classes classes;
    return classes;
}

class SwitchTest : public ::testing::Test {
protected:
    void SetUp() override { ts::LoadOperators(); }

    /// A Switch of `n` inputs, each linked to a source of its own with a
    /// different image (position i: a pattern over (i, 0) .. (8 + i, 6)).
    Operator *MakeSwitch(int n) {
        Operator *sw = doc->AddTool(OvID("Switch"), "Switch1");
        EXPECT_NE(sw, nullptr);
        if (!sw) return nullptr;
        ts::SetNumber(sw, "NumberOfInputs", n);
        for (int i = 0; i < n; ++i) {
            const ImgRectI dw(i, 0, 8 + i, 6);
            images.push_back(ts::PatternImage(8 + i, 6, 8, 10 + i)->CopyOfImageTagList({{ImgDataWindow, &dw}}));
            sources.push_back(ts::AddImageSource(*doc, "Src" + std::to_string(i), images.back()));
            Input *in = sw->FindInput(("Input" + std::to_string(i)).c_str());
            EXPECT_TRUE(in && in->ConnectTo(sources.back()->Out())) << i;
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

TEST_F(SwitchTest, HandsOnTheChosenImageItselfAndRendersNothingElseOrFailsWithOneLine) {
    Operator *sw = MakeSwitch(3);
    ASSERT_NE(sw, nullptr);
    EXPECT_FALSE(sw->IsPlaceholder());
    // Source is rounded half up: each value and the position it picks.
    const struct {
        double source;
        int chosen;
    } cases[] = {{0, 0}, {2, 2}, {1, 1}, {0.49, 0}, {1.5, 2}, {-0.4, 0}, {-0.5, 0}, {1.2, 1}};
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
    // Pre-calculation regions and SkipRoI follow the chosen input.
    for (int i = 0; i < 3; ++i) {
        ts::SetNumber(sw, "Source", i);
        Ref<Parameter> shape = Eval(sw, 0.0, ReqFlagPreCalc);
        auto *img = dynamic_cast<Image *>(shape.Get());
        ASSERT_TRUE(img && img->IsNoData());
        EXPECT_EQ(img->DataWindow(), ImgRectI(i, 0, 8 + i, 6)) << i;
    }
    // A region of interest reaches the chosen input unchanged: its pixels come back for exactly that region.
    ts::SetNumber(sw, "Source", 2);
    const ImgRectI roi(3, 1, 6, 4);
    const size_t asked = sources[2]->asked.size();
    Ref<Image> part = ts::EvalImage(sw, 0.0, &roi);
    ASSERT_TRUE(part && sources[2]->asked.size() == asked + 1);
    for (int y = roi.y0; y < roi.y1; ++y)
        for (int x = roi.x0; x < roi.x1; ++x) EXPECT_EQ(part->GetFlt(x, y), images[2]->GetFlt(x, y)) << x << "," << y;
    ASSERT_TRUE(sources[2]->asked.back());
    EXPECT_EQ(sources[2]->asked.back()->rect, roi);

    // With SkipRoI the request is left alone: all inputs render, and the result is still the chosen one.
    ts::SetNumber(sw, "Source", 1);
    const std::vector<int> before = Counts();
    Ref<Parameter> out = Eval(sw, 0.0, ReqFlagSkipRoI);
    EXPECT_EQ(out.Get(), images[1].Get());
    for (int i = 0; i < 3; ++i) EXPECT_EQ(Counts()[i], before[i] + 1) << i;

    // Fewer inputs than positions made: the range follows NumberOfInputs. A chosen position without a link
    // fails in pre-calculation too.
    const std::string to = " - the switch tool tried to switch to a non-existant input ",
                      only = " (currently inputs only exist for the range [0, ";
    const struct {
        double inputs, source, time;
        uint32_t flags;
        std::string line;
    } failures[] = {
        {3, 3, 0, 0, "Switch1 failed at time 0.0" + to + "3" + only + "2])"},
        {3, -1, 12.3, 0, "Switch1 failed at time 12.3" + to + "-1" + only + "2])"},
        {2, 2, 0, 0, "Switch1 failed at time 0.0" + to + "2" + only + "1])"},
        {4, 3, 7, 0, "Switch1.Input3 failed at time 7.0 - unconnected input"},
        {4, 3, 7, ReqFlagPreCalc, "Switch1.Input3 failed at time 7.0 - unconnected input"},
    };
    for (const auto &c : failures) {
        SCOPED_TRACE(c.line);
        ts::SetNumbers(sw, {{"NumberOfInputs", c.inputs}, {"Source", c.source}});
        doc->ClearConsole();
        const std::vector<int> before = Counts();
        EXPECT_EQ(Eval(sw, c.time, c.flags), nullptr);
        EXPECT_EQ(Lines(), std::vector<std::string>{c.line});
        EXPECT_EQ(Counts(), before) << "a failing switch renders none of its inputs";
    }
    // A position without a link that is not chosen is no failure.
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
    EXPECT_EQ(sw->FindInput("Source")->Priority(), sw->FindInput("Input0")->Priority() - 1)
        << "Source is known when inputs are chosen";

    ts::SetNumber(sw, "NumberOfInputs", 5);
    EXPECT_EQ(positions(sw), 5);
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Late", ts::PatternImage(4, 4));
    ASSERT_TRUE(sw->FindInput("Input4")->ConnectTo(src->Out()));
    ASSERT_TRUE(sw->FindInput("Name4")->SetValue(MakeRef<Text>("late one")));
    ts::SetNumber(sw, "Source", 4);
    Ref<Image> before = ts::EvalImage(sw);

    // Lowering the count hides positions; they keep their links.
    ts::SetNumber(sw, "NumberOfInputs", 3);
    EXPECT_EQ(positions(sw), 5);
    EXPECT_TRUE(sw->FindInput("Input2")->IsVisible());
    EXPECT_FALSE(sw->FindInput("Input3")->IsVisible() || sw->FindInput("Name4")->IsVisible());
    EXPECT_EQ(sw->FindInput("Input4")->Link(), src->Out());
    ts::SetNumber(sw, "NumberOfInputs", 5);
    EXPECT_TRUE(sw->FindInput("Input4")->IsVisible() && positions(sw) == 5);

    // Saved and read back: the positions come back before their links.
    const std::string text = SaveDocument(*doc);
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    const DocumentLoadResult loaded = LoadDocument(text, *again);
    ASSERT_TRUE(loaded.ok) << loaded.error;
    EXPECT_TRUE(loaded.warnings.empty()) << loaded.warnings.front();
    auto *late = dynamic_cast<ts::ImageSourceTool *>(again->FindTool("Late"));
    Operator *sw2 = again->FindTool("Switch1");
    ASSERT_TRUE(late && sw2 && sw2->FindInput("Input4")->Link());
    late->SetImage(ts::PatternImage(4, 4));
    EXPECT_EQ(positions(sw2), 5);
    EXPECT_EQ(sw2->FindInput("Input4")->Link()->Owner()->Name(), "Late");
    EXPECT_EQ(dynamic_cast<const Text &>(*sw2->FindInput("Name4")->Constant()).value, "late one");
    EXPECT_EQ(SaveDocument(*again), text);
    Ref<Image> after = ts::EvalImage(sw2);
    ASSERT_TRUE(before && after);
    EXPECT_EQ(after->DataWindow(), before->DataWindow());
    EXPECT_EQ(after->GetFlt(2, 3), before->GetFlt(2, 3));
}

TEST_F(SwitchTest, ThreeDValuesAndPendingTransformsAreHandedOnAsTheyAre) {
    const struct {
        const char *cls;
        OvID source;
        OvID type;
    } cases[] = {{"Switch3D", C().scene, CLSID_DataType_3D}, {"MtlSwitch3D", C().material, CLSID_DataType_MtlGraph3D}};
    for (const auto &c : cases) {
        SCOPED_TRACE(c.cls);
        Operator *sw = doc->AddTool(OvID(c.cls));
        ASSERT_TRUE(sw && sw->FindMainOutput()->DataType() == c.type);
        std::vector<ValueSource *> values;
        for (int i = 0; i < 2; ++i) {
            values.push_back(dynamic_cast<ValueSource *>(doc->AddTool(c.source)));
            ASSERT_TRUE(values[i] &&
                        sw->FindInput(("Input" + std::to_string(i)).c_str())->ConnectTo(values[i]->output));
        }
        // An image cannot be linked where a 3D value is expected.
        ts::ImageSourceTool *img = ts::AddImageSource(*doc, std::string("Img") + c.cls, ts::PatternImage(2, 2));
        EXPECT_FALSE(sw->FindInput("Input0")->ConnectTo(img->Out()));

        for (int chosen : {1, 0}) {
            ts::SetNumber(sw, "Source", chosen);
            const int counts[2] = {values[0]->processCount, values[1]->processCount};
            EXPECT_EQ(Eval(sw).Get(), values[chosen]->value.Get());
            EXPECT_EQ(values[chosen]->processCount, counts[chosen] + 1);
            EXPECT_EQ(values[1 - chosen]->processCount, counts[1 - chosen]) << "the other value is not asked for";
        }
        // Without pre-calculation the 3D switches report an unlinked choice in their one pass.
        sw->FindInput("Input1")->Disconnect();
        ts::SetNumber(sw, "Source", 1);
        doc->ClearConsole();
        EXPECT_EQ(Eval(sw, 3.0), nullptr);
        EXPECT_EQ(Lines(), std::vector<std::string>{sw->Name() + ".Input1 failed at time 3.0 - unconnected input"});
    }
    // A pending transform passes through a Switch unflattened.
    Operator *sw = doc->AddTool(OvID("Switch"), "Switch1");
    auto *xf = dynamic_cast<ValueSource *>(doc->AddTool(C().transform));
    ASSERT_TRUE(sw && xf);
    ts::ImageSourceTool *img = ts::AddImageSource(*doc, "Plain", ts::PatternImage(4, 3));
    ASSERT_TRUE(sw->FindInput("Input0")->ConnectTo(xf->output));
    ASSERT_TRUE(sw->FindInput("Input1")->ConnectTo(img->Out()));
    ts::ValueProbe *probe = ts::AddValueProbe(*doc, sw, true); // takes images and pending transforms
    ASSERT_NE(probe, nullptr);

    ts::SetNumber(sw, "Source", 0);
    Eval(probe);
    ASSERT_EQ(probe->seen.size(), 1u);
    EXPECT_EQ(probe->seen[0].Get(), xf->value.Get());
    ts::SetNumber(sw, "Source", 1);
    Eval(probe);
    ASSERT_EQ(probe->seen.size(), 2u);
    EXPECT_EQ(probe->seen[1].Get(), ts::EvalImage(img).Get());
}

} // namespace
} // namespace Orvane::switchtest
