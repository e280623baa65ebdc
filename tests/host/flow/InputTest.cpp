#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputValue.h"
#include "host/flow/Request.h"
#include "tests/support/TestSupport.h"

namespace Orvane::inputtest {
namespace ts = ::Orvane::Test;
namespace {

using Names = std::vector<std::string>;

/// A tool with one input of each kind the tests need. Its "Value" output is the number that reached Process through the
/// input named by `watch`.
class KnobsTool : public ThreadedOperator {
public:
    KnobsTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        const OvID number = CLSID_DataType_Number, idA("ModeA"), idB("ModeB");
        ts::AddIn(this, "Hard", number,
                  {{InputMinAllowed, -1.0}, {InputMaxAllowed, 10.0}, {InputSliderLow, 0.0}, {InputSliderHigh, 5.0}});
        ts::AddIn(this, "Count", number, {{InputInteger, 1}, {InputMinAllowed, -3.0}, {InputMaxAllowed, 8.0}});
        ts::AddIn(this, "Where", CLSID_DataType_Point,
                  {{InputMinAllowed, 0.0}, {InputMaxAllowed, 1.0}, {InputDefaultX, 0.5}, {InputDefaultY, 0.25}});
        ts::AddIn(this, "Caption", CLSID_DataType_Text, {{InputDefaultText, "hello"}});
        ts::AddIn(
            this, "Mode", CLSID_DataType_OvID,
            {{InputDefaultId, idB}, {ListAddItem, "A"}, {ListItemId, idA}, {ListAddItem, "B"}, {ListItemId, idB}});
        ts::AddIn(this, "Blend", number, {{ListAddItem, "Normal"}, {ListAddItem, "Soft Light"}});
        ts::AddIn(this, "File", CLSID_DataType_Clip);
        ts::AddIn(this, "Hidden", number, {{ControlVisible, 0}, {InputDefault, 3.0}});
        ts::AddIn(this, "Internal", number, {{InputExternal, 0}, {InputDefault, 4.0}});
        ts::AddIn(this, "Notified", number, {{InputNotify, 1}, {InputDefault, 1.0}});
        ts::AddIn(this, "Quiet", number, {{InputNotify, 1}, {InputInitialNotify, 0}}); // not told its first value
        ts::AddImageIn(this, {{InputRequired, 0}});
        ts::AddImageOut(this);
        value = AddOutputTagList("Value", "Value", {{LinkDataType, number}});
    }
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override {
        if (auto *n = dynamic_cast<Number *>(param))
            heard.push_back(in->ID().Text() + (" " + ScriptVal(n->value).ToText()));
        ThreadedOperator::NotifyChanged(in, param, time, tags);
    }
    void Process(Request *req) override {
        ++processCount;
        auto *n = dynamic_cast<Number *>(req->GetInputData(FindInput(watch.c_str())));
        req->SetOutputData(value, n ? MakeRef<Number>(n->value) : nullptr);
    }
    Output *value;
    std::string watch = "Hidden";
    Names heard; ///< "input value" for each NotifyChanged with a number
    int processCount = 0;
};

double NumberOf(const Ref<Parameter> &p) {
    auto *n = dynamic_cast<const Number *>(p.Get());
    EXPECT_NE(n, nullptr);
    return n ? n->value : -12345.0;
}

// A flow of three knob tools, A, B and C.
class InputTest : public ::testing::Test {
protected:
    KnobsTool *Add(const char *name) {
        static const OvID cls = ts::RegisterTool("InputTestKnobs", &ts::MakeTool<KnobsTool>,
                                                 {{RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
        return dynamic_cast<KnobsTool *>(doc->AddTool(cls, name));
    }
    void SetUp() override { ASSERT_TRUE(a && b && c); }
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    KnobsTool *a = Add("A"), *b = Add("B"), *c = Add("C");
};

// Constants and curve keys alike; the slider limits do not bind.
TEST_F(InputTest, HardLimitsClampAndWholeInputsRound) {
    auto stored = [&](const char *id, std::initializer_list<double> values) {
        std::string out;
        Input *in = a->FindInput(id);
        for (double v : values) {
            EXPECT_TRUE(in->SetValue(MakeRef<Number>(v)));
            out += in->ValueAt(10.0)->ToScript().ToText() + " "; // the curve set before is gone
            EXPECT_TRUE(in->SetCurve(ts::NumberCurve({{0.0, 0.0}, {10.0, v}})));
            EXPECT_EQ(NumberOf(in->Curve()->Keys()[1].value), NumberOf(in->ValueAt(10.0)));
            out += in->ValueAt(10.0)->ToScript().ToText() + " ";
        }
        return out;
    };
    // Beyond the slider only; beyond the hard limits; at one. Rounded; rounded, then limited.
    EXPECT_EQ(stored("Hard", {7.0, -0.5, 11.0, -1.5, 10.0}), "7 7 -0.5 -0.5 10 10 -1 -1 10 10 ");
    EXPECT_EQ(stored("Count", {2.4, 2.6, -1.4, -2.6, 8.7, -9.0}), "2 2 3 3 -1 -1 -3 -3 8 8 -3 -3 ");
    // Both parts of a point.
    ASSERT_TRUE(a->FindInput("Where")->SetValue(MakeRef<Point>(1.5, -0.25)));
    EXPECT_EQ(a->FindInput("Where")->Constant()->ToScript().ToText(), "{ 1, 0 }");
}

TEST_F(InputTest, ValuesOfTheWrongTypeAreRefused) {
    const Ref<Parameter> text = MakeRef<Text>("ModeA"), point = MakeRef<Point>(1.0, 2.0), number = MakeRef<Number>(0.5),
                         id = MakeRef<IDValue>(OvID("hello"));
    const std::pair<const char *, Ref<Parameter>> cases[] = {{"Hard", text},      {"Hard", point},  {"Where", number},
                                                             {"Caption", number}, {"Caption", id},  {"Mode", text},
                                                             {"Input", number},   {"Hard", nullptr}};
    for (const auto &[input, value] : cases) {
        Input *in = a->FindInput(input);
        const Ref<Parameter> before = in->Constant();
        EXPECT_FALSE(in->SetValue(value)) << input;
        EXPECT_EQ(in->Constant().Get(), before.Get()) << input << ": the old value stays";
        AnimCurve curve;
        curve.SetKey(0.0, value ? value : text);
        EXPECT_FALSE(in->SetCurve(curve) || in->IsAnimated()) << input;
    }
}

TEST_F(InputTest, DefaultsComeFromTheTagsAndIsDefaultTracksThem) {
    std::string defaults;
    for (const char *id : {"Hard", "Where", "Caption", "Mode", "Hidden"}) {
        EXPECT_TRUE(a->FindInput(id)->IsDefault()) << id;
        defaults += a->FindInput(id)->Constant()->ToScript().ToText() + " ";
    }
    EXPECT_EQ(defaults, "0 { 0.5, 0.25 } \"hello\" \"ModeB\" 3 ");
    Input *hidden = a->FindInput("Hidden");
    ASSERT_TRUE(hidden->SetValue(MakeRef<Number>(2.0)));
    EXPECT_FALSE(hidden->IsDefault());
    // An equal value, not the same object, is the default; an animated input is not at its default.
    ASSERT_TRUE(hidden->SetValue(MakeRef<Number>(3.0)));
    EXPECT_TRUE(hidden->IsDefault());
    ASSERT_TRUE(hidden->SetCurve(ts::NumberCurve({{0.0, 3.0}})));
    EXPECT_FALSE(hidden->IsDefault());
    hidden->ResetValue();
    EXPECT_TRUE(hidden->IsDefault() && !hidden->IsAnimated());
    // A value that rounds to the default is the default.
    ASSERT_TRUE(a->FindInput("Count")->SetValue(MakeRef<Number>(0.3)));
    EXPECT_TRUE(a->FindInput("Count")->IsDefault());
}

TEST_F(InputTest, LinksCheckTypesRefuseLoopsAndGoWithANewValue) {
    // Links first made: B.Input <- A.Output, C.Input <- B.Output (A -> B -> C).
    ASSERT_TRUE(b->FindInput("Input")->ConnectTo(a->FindOutput("Output")));
    ASSERT_TRUE(c->FindInput("Input")->ConnectTo(b->FindOutput("Output")));
    const std::tuple<const char *, Input *, Output *, bool> cases[] = {
        {"number from an image", a->FindInput("Hard"), b->FindOutput("Output"), false},
        {"image from a number", c->FindInput("Input"), a->FindOutput("Value"), false},
        {"to itself", a->FindInput("Input"), a->FindOutput("Output"), false},
        {"A -> B -> C -> A", a->FindInput("Input"), c->FindOutput("Output"), false},
        {"a loop through a number link", a->FindInput("Hard"), c->FindOutput("Value"), false},
        {"null output", a->FindInput("Hard"), nullptr, false},
        {"internal input", c->FindInput("Internal"), a->FindOutput("Value"), false},
        {"number from a number", c->FindInput("Hard"), a->FindOutput("Value"), true},
        {"image from a second branch", c->FindInput("Input"), a->FindOutput("Output"), true},
    };
    for (const auto &[name, in, out, ok] : cases) {
        Output *before = in->Link();
        EXPECT_EQ(in->ConnectTo(out), ok) << name;
        EXPECT_EQ(in->Link(), ok ? out : before) << name;
    }
    // Consumers follow the links.
    EXPECT_EQ(a->FindOutput("Output")->Consumers(),
              (std::vector<Input *>{b->FindInput("Input"), c->FindInput("Input")}));
    EXPECT_TRUE(b->FindOutput("Output")->Consumers().empty()) << "C's Input moved on to A";
    // Disconnect and SetValue drop a link.
    Input *hard = b->FindInput("Hard");
    ASSERT_TRUE(hard->ConnectTo(c->FindOutput("Value")));
    EXPECT_FALSE(hard->IsDefault() || hard->ValueAt(0.0)) << "a linked input has no value of its own";
    hard->Disconnect();
    EXPECT_TRUE(hard->Link() == nullptr && c->FindOutput("Value")->Consumers().empty() && hard->IsDefault());
    hard->Disconnect(); // again: nothing happens
    ASSERT_TRUE(hard->ConnectTo(c->FindOutput("Value")));
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(6.0)));
    EXPECT_TRUE(hard->Link() == nullptr && c->FindOutput("Value")->Consumers().empty());
    // Once the link is gone, the other way round is no longer a loop.
    EXPECT_TRUE(c->FindInput("Hard")->ConnectTo(b->FindOutput("Value")));
}

TEST_F(InputTest, AttributesChangeAtRunTimeAndHiddenAndInternalInputsStillDeliver) {
    Input *hidden = a->FindInput("Hidden"), *hard = a->FindInput("Hard"), *internal = a->FindInput("Internal");
    EXPECT_FALSE(hidden->IsVisible() || internal->IsExternal());
    hard->SetAttrsTagList({{ControlVisible, 0}});
    EXPECT_FALSE(hard->IsVisible());
    EXPECT_FALSE(internal->SetCurve(ts::NumberCurve({{0.0, 1.0}})) || internal->IsAnimated())
        << "an internal input takes no curve";
    for (const auto &[input, value] : {std::pair{"Hidden", 7.5}, {"Hard", 6.25}, {"Internal", 9.0}}) {
        ASSERT_TRUE(a->FindInput(input)->SetValue(MakeRef<Number>(value)));
        a->watch = input;
        EXPECT_EQ(NumberOf(Evaluate(a->value, value)), value) << input;
    }
    // Shown again with a new label; a new limit holds for values set afterwards, other tags stay.
    hard->SetAttrsTagList({{ControlVisible, 1}, {ControlLabel, "Strength"}, {InputMaxAllowed, 3.0}});
    EXPECT_TRUE(hard->IsVisible() && hard->Label() == std::string("Strength"));
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(9.0)));
    EXPECT_EQ(std::pair(NumberOf(hard->Constant()), hard->Tags().GetDouble(InputMinAllowed)), std::pair(3.0, -1.0));
}

TEST_F(InputTest, NotifyChangedHearsFirstValuesAndChangesButNeverRendersAndTextBecomesTheValueTheInputTakes) {
    EXPECT_EQ(a->heard, Names{"Notified 1"});
    a->heard.clear();
    Input *notified = a->FindInput("Notified");
    ASSERT_TRUE(notified->SetValue(MakeRef<Number>(2.5)));
    ASSERT_TRUE(a->FindInput("Quiet")->SetValue(MakeRef<Number>(-1)));
    ASSERT_TRUE(a->FindInput("Hard")->SetValue(MakeRef<Number>(9)));
    ASSERT_TRUE(notified->SetCurve(ts::NumberCurve({{0, 4}, {10, 8}}))); // heard with its value at the start
    notified->ResetValue();                                              // heard with the default
    EXPECT_FALSE(notified->SetValue(MakeRef<Text>("x"))) << "a value refused changes nothing and is not heard";
    EXPECT_EQ(a->heard, (Names{"Notified 2.5", "Quiet -1", "Notified 4", "Notified 1"}));
    ASSERT_TRUE(b->FindInput("Notified")->ConnectTo(a->FindOutput("Value")));
    b->watch = "Notified";
    a->heard.clear(), b->heard.clear();
    for (double time : {0.0, 1.0, 2.0}) EXPECT_EQ(NumberOf(Evaluate(b->value, time)), 3.0);
    EXPECT_TRUE(b->processCount == 3 && a->heard.empty() && b->heard.empty());
    // Text as typed on a command line: script syntax where it parses, text as it stands for inputs that take text, a
    // link only to a tool that exists.
    std::string read;
    for (const std::string set :
         {"Hard=2.5", "Hard=\"7\"", "Hard=Nope.Value", "Where={ 0.5, 0.25 }", "Caption=two words", "Caption=\"quoted\"",
          "Caption=42", "Caption=A", "Caption=A.Output", "Caption=Nope.Output", "File=renders/a.####.exr", "Mode=ModeA",
          "Blend=Soft Light", "Blend=1"}) {
        const size_t eq = set.find('=');
        read += InputValueFromText(*doc, a->FindInput(set.substr(0, eq).c_str()), set.substr(eq + 1)).ToText() + " ";
    }
    // Written back as script: texts in quotes, links bare.
    EXPECT_EQ(read, "2.5 \"7\" Nope.Value { 0.5, 0.25 } \"two words\" \"quoted\" \"42\" \"A\" A.Output \"Nope.Output\" "
                    "\"renders/a.####.exr\" \"ModeA\" \"Soft Light\" 1 ");
    // A choice by name, as typed, sets its number.
    Input *blend = a->FindInput("Blend");
    for (const auto &[text, choice] : {std::pair{"soft light", 1.0}, std::pair{"Normal", 0.0}}) {
        EXPECT_EQ(ApplyInputValue(*doc, blend, InputValueFromText(*doc, blend, text)), "") << text;
        EXPECT_EQ(NumberOf(blend->Constant()), choice) << text;
    }
    std::string refusals;
    for (const char *text : {"1 2", "{ 0.5"}) {
        try {
            ADD_FAILURE() << "read as " << InputValueFromText(*doc, a->FindInput("Hard"), text).ToText();
        } catch (const std::invalid_argument &e) {
            refusals += e.what() + std::string("\n");
        }
    }
    EXPECT_EQ(refusals,
              "expects a number or Tool.Output, not '1 2' (unexpected number after the value)\n"
              "expects a number or Tool.Output, not '{ 0.5' (expected '}' to close table opened at line 1)\n");
    // The entries of list inputs, with the IDs of ID lists.
    std::string choices;
    for (const char *id : {"Mode", "Blend", "Hard"})
        for (const InputChoice &choice : InputChoices(a->FindInput(id)))
            choices += choice.label + "=" + choice.id + " ";
    EXPECT_EQ(choices, "A=ModeA B=ModeB Normal= Soft Light= ");
}

} // namespace
} // namespace Orvane::inputtest
