// Inputs: limits, integer rounding, types, links (and the loops they must
// not make), external and hidden inputs, run-time attribute changes, the
// main-thread NotifyChanged hook staying out of renders, and values typed
// as text on a command line.
#include <atomic>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/InputValue.h"
#include "host/flow/Request.h"
#include "tests/support/TestSupport.h"

namespace Orvane::inputtest {
namespace {

/// A tool with one input of each kind the tests need. Its "Value" output is
/// the number that reached Process through the input named by `watch`.
class KnobsTool : public ThreadedOperator {
public:
    KnobsTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        const OvID number = CLSID_DataType_Number;
        Knob("Hard", number,
             {{InputMinAllowed, -1.0}, {InputMaxAllowed, 10.0}, {InputSliderLow, 0.0}, {InputSliderHigh, 5.0}});
        Knob("Count", number, {{InputInteger, 1}, {InputMinAllowed, -3.0}, {InputMaxAllowed, 8.0}});
        Knob("Where", CLSID_DataType_Point,
             {{InputMinAllowed, 0.0}, {InputMaxAllowed, 1.0}, {InputDefaultX, 0.5}, {InputDefaultY, 0.25}});
        Knob("Caption", CLSID_DataType_Text, {{InputDefaultText, "hello"}});
        Knob("Mode", CLSID_DataType_OvID,
             {{InputDefaultId, OvID("ModeB")},
              {ListAddItem, "A"},
              {ListItemId, OvID("ModeA")},
              {ListAddItem, "B"},
              {ListItemId, OvID("ModeB")}});
        Knob("Blend", number, {{ListAddItem, "Normal"}, {ListAddItem, "Soft Light"}});
        Knob("File", CLSID_DataType_Clip, {});
        Knob("Hidden", number, {{ControlVisible, 0}, {InputDefault, 3.0}});
        Knob("Internal", number, {{InputExternal, 0}, {InputDefault, 4.0}});
        Knob("Notified", number, {{InputNotify, 1}, {InputDefault, 1.0}});
        Knob("Input", CLSID_DataType_Image, {{LinkMain, 1}, {InputRequired, 0}});
        AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
        value = AddOutputTagList("Value", "Value", {{LinkDataType, CLSID_DataType_Number}});
    }
    void Knob(const char *id, OvID type, TagList tags) {
        tags.Add({LinkDataType, type});
        AddInputTagList(id, id, tags);
    }
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override {
        ++notifications;
        ThreadedOperator::NotifyChanged(in, param, time, tags);
    }
    void Process(Request *req) override {
        ++processCount;
        auto *n = dynamic_cast<Number *>(req->GetInputData(FindInput(watch.c_str())));
        req->SetOutputData(value, n ? MakeRef<Number>(n->value) : nullptr);
    }
    Output *value;
    std::string watch = "Hidden";
    std::atomic<int> notifications{0};
    int processCount = 0;
};

Object *MakeKnobs(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new KnobsTool(reg, args, tags);
}

OvID KnobsClass() {
    static const OvID id = [] {
        TagList tags{{RegConstructor, &MakeKnobs},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1}};
        Registry::_Init(&ClassRegistry, OvID("InputTestKnobs"), tags);
        return OvID("InputTestKnobs");
    }();
    return id;
}

struct Knobs {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    KnobsTool *Add(const std::string &name) {
        auto *k = dynamic_cast<KnobsTool *>(doc->AddTool(KnobsClass(), name));
        EXPECT_NE(k, nullptr);
        return k;
    }
};

double NumberOf(const Ref<Parameter> &p) {
    auto *n = dynamic_cast<const Number *>(p.Get());
    EXPECT_NE(n, nullptr);
    return n ? n->value : -12345.0;
}

// Constants and curve keys alike: the hard limits hold, the slider limits do not, whole inputs round.
TEST(Input, HardLimitsClampAndWholeInputsRound) {
    const struct {
        const char *input;
        double set, stored;
    } cases[] = {
        {"Hard", 7.0, 7.0},    {"Hard", -0.5, -0.5}, // beyond the slider, within the hard limits
        {"Hard", 11.0, 10.0},  {"Hard", -1.5, -1.0},  {"Hard", 10.0, 10.0}, {"Count", 2.4, 2.0},   {"Count", 2.6, 3.0},
        {"Count", -1.4, -1.0}, {"Count", -2.6, -3.0}, {"Count", 8.7, 8.0},  {"Count", -9.0, -3.0},
    };
    Knobs k;
    KnobsTool *t = k.Add("K1");
    for (const auto &c : cases) {
        SCOPED_TRACE(std::string(c.input) + " = " + std::to_string(c.set));
        Input *in = t->FindInput(c.input);
        ASSERT_TRUE(in->SetValue(MakeRef<Number>(c.set)));
        EXPECT_EQ(NumberOf(in->Constant()), c.stored);
        AnimCurve curve;
        curve.SetKey(0.0, MakeRef<Number>(0.0));
        curve.SetKey(10.0, MakeRef<Number>(c.set));
        ASSERT_TRUE(in->SetCurve(curve));
        EXPECT_EQ(NumberOf(in->Curve()->Keys()[1].value), c.stored);
        EXPECT_EQ(NumberOf(in->ValueAt(10.0)), c.stored);
    }
    // Both parts of a point.
    Input *where = t->FindInput("Where");
    ASSERT_TRUE(where->SetValue(MakeRef<Point>(1.5, -0.25)));
    const auto &p = dynamic_cast<const Point &>(*where->Constant());
    EXPECT_EQ(std::make_pair(p.x, p.y), std::make_pair(1.0, 0.0));
}

TEST(Input, ValuesOfTheWrongTypeAreRefused) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    const struct {
        const char *input;
        Ref<Parameter> value;
    } cases[] = {
        {"Hard", MakeRef<Text>("7")},
        {"Hard", MakeRef<Point>(1.0, 2.0)},
        {"Where", MakeRef<Number>(0.5)},
        {"Caption", MakeRef<Number>(1.0)},
        {"Caption", MakeRef<IDValue>(OvID("hello"))},
        {"Mode", MakeRef<Text>("ModeA")},
        {"Input", MakeRef<Number>(1.0)},
        {"Hard", nullptr},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.input);
        Input *in = t->FindInput(c.input);
        const Ref<Parameter> before = in->Constant();
        EXPECT_FALSE(in->SetValue(c.value));
        EXPECT_EQ(in->Constant().Get(), before.Get()) << "the old value stays";
        AnimCurve curve;
        if (c.value) {
            curve.SetKey(0.0, c.value);
            EXPECT_FALSE(in->SetCurve(curve));
            EXPECT_FALSE(in->IsAnimated());
        }
    }
}

TEST(Input, DefaultsComeFromTheTagsAndIsDefaultTracksThem) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    for (const char *id : {"Hard", "Count", "Where", "Caption", "Mode", "Hidden"})
        EXPECT_TRUE(t->FindInput(id)->IsDefault()) << id;
    EXPECT_EQ(NumberOf(t->FindInput("Hidden")->Constant()), 3.0);
    EXPECT_EQ(dynamic_cast<const Text &>(*t->FindInput("Caption")->Constant()).value, "hello");
    EXPECT_EQ(dynamic_cast<const IDValue &>(*t->FindInput("Mode")->Constant()).value, OvID("ModeB"));
    const auto &where = dynamic_cast<const Point &>(*t->FindInput("Where")->Constant());
    EXPECT_EQ(std::make_pair(where.x, where.y), std::make_pair(0.5, 0.25));

    Input *hidden = t->FindInput("Hidden");
    ASSERT_TRUE(hidden->SetValue(MakeRef<Number>(2.0)));
    EXPECT_FALSE(hidden->IsDefault());
    ASSERT_TRUE(hidden->SetValue(MakeRef<Number>(3.0))); // an equal value, not the same object
    EXPECT_TRUE(hidden->IsDefault());
    AnimCurve curve;
    curve.SetKey(0.0, MakeRef<Number>(3.0));
    ASSERT_TRUE(hidden->SetCurve(curve));
    EXPECT_FALSE(hidden->IsDefault()) << "an animated input is not at its default";
    hidden->ResetValue();
    EXPECT_TRUE(hidden->IsDefault() && !hidden->IsAnimated());
    // A value that rounds to the default is the default.
    ASSERT_TRUE(t->FindInput("Count")->SetValue(MakeRef<Number>(0.3)));
    EXPECT_TRUE(t->FindInput("Count")->IsDefault());
}

TEST(Input, ConnectToChecksTypesAndRefusesLoops) {
    Knobs k;
    KnobsTool *a = k.Add("A"), *b = k.Add("B"), *c = k.Add("C");
    // Links first made: B.Input <- A.Output, C.Input <- B.Output (A -> B -> C).
    ASSERT_TRUE(b->FindInput("Input")->ConnectTo(a->FindOutput("Output")));
    ASSERT_TRUE(c->FindInput("Input")->ConnectTo(b->FindOutput("Output")));
    const struct {
        const char *name;
        Input *in;
        Output *out;
        bool ok;
    } cases[] = {
        {"number from an image", a->FindInput("Hard"), b->FindOutput("Output"), false},
        {"image from a number", c->FindInput("Input"), a->FindOutput("Value"), false},
        {"point from a number", c->FindInput("Where"), a->FindOutput("Value"), false},
        {"to itself", a->FindInput("Input"), a->FindOutput("Output"), false},
        {"A -> B -> A", a->FindInput("Input"), b->FindOutput("Output"), false},
        {"A -> B -> C -> A", a->FindInput("Input"), c->FindOutput("Output"), false},
        {"a loop through a number link", a->FindInput("Hard"), c->FindOutput("Value"), false},
        {"null output", a->FindInput("Hard"), nullptr, false},
        {"number from a number", c->FindInput("Hard"), a->FindOutput("Value"), true},
        {"image from a second branch", c->FindInput("Input"), a->FindOutput("Output"), true},
    };
    for (const auto &t : cases) {
        SCOPED_TRACE(t.name);
        Output *before = t.in->Link();
        EXPECT_EQ(t.in->ConnectTo(t.out), t.ok);
        EXPECT_EQ(t.in->Link(), t.ok ? t.out : before);
    }
    // Consumers follow the links.
    EXPECT_EQ(a->FindOutput("Output")->Consumers(),
              (std::vector<Input *>{b->FindInput("Input"), c->FindInput("Input")}));
    EXPECT_TRUE(b->FindOutput("Output")->Consumers().empty()) << "C's Input moved on to A";
}

TEST(Input, DisconnectAndSetValueDropTheLink) {
    Knobs k;
    KnobsTool *a = k.Add("A"), *b = k.Add("B");
    Input *hard = b->FindInput("Hard");
    ASSERT_TRUE(hard->ConnectTo(a->FindOutput("Value")));
    EXPECT_FALSE(hard->IsDefault());
    EXPECT_FALSE(hard->ValueAt(0.0)) << "a linked input has no value of its own";
    hard->Disconnect();
    EXPECT_TRUE(hard->Link() == nullptr && a->FindOutput("Value")->Consumers().empty() && hard->IsDefault());
    hard->Disconnect(); // again: nothing happens

    ASSERT_TRUE(hard->ConnectTo(a->FindOutput("Value")));
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(6.0)));
    EXPECT_TRUE(hard->Link() == nullptr && a->FindOutput("Value")->Consumers().empty());
    // Once the link is gone, the other way round is no longer a loop.
    EXPECT_TRUE(a->FindInput("Hard")->ConnectTo(b->FindOutput("Value")));
}

TEST(Input, AttributesChangeAtRunTimeAndHiddenInputsStillDeliver) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    Input *hidden = t->FindInput("Hidden"), *hard = t->FindInput("Hard");
    EXPECT_FALSE(hidden->IsVisible());
    ASSERT_TRUE(hidden->SetValue(MakeRef<Number>(7.5)));
    EXPECT_EQ(NumberOf(Evaluate(t->value, 0.0)), 7.5);
    // Hidden at run time, after the value was set.
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(6.25)));
    hard->SetAttrsTagList({{ControlVisible, 0}});
    EXPECT_FALSE(hard->IsVisible());
    t->watch = "Hard";
    EXPECT_EQ(NumberOf(Evaluate(t->value, 1.0)), 6.25);
    // Shown again with a new label; a new limit holds for values set afterwards, other tags stay.
    hard->SetAttrsTagList({{ControlVisible, 1}, {ControlLabel, "Strength"}, {InputMaxAllowed, 3.0}});
    EXPECT_TRUE(hard->IsVisible());
    EXPECT_STREQ(hard->Label(), "Strength");
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(9.0)));
    EXPECT_EQ(NumberOf(hard->Constant()), 3.0);
    EXPECT_EQ(hard->Tags().GetDouble(InputMinAllowed), -1.0);
}

TEST(Input, AnInternalInputTakesNoLinkAndNoCurve) {
    Knobs k;
    KnobsTool *a = k.Add("A"), *b = k.Add("B");
    Input *internal = b->FindInput("Internal");
    EXPECT_FALSE(internal->IsExternal());
    EXPECT_FALSE(internal->ConnectTo(a->FindOutput("Value")));
    EXPECT_EQ(internal->Link(), nullptr);
    AnimCurve curve;
    curve.SetKey(0.0, MakeRef<Number>(1.0));
    curve.SetKey(5.0, MakeRef<Number>(2.0));
    EXPECT_FALSE(internal->SetCurve(curve));
    EXPECT_FALSE(internal->IsAnimated());
    // It still holds a constant, which reaches the render.
    ASSERT_TRUE(internal->SetValue(MakeRef<Number>(9.0)));
    b->watch = "Internal";
    EXPECT_EQ(NumberOf(Evaluate(b->value, 0.0)), 9.0);
}

TEST(Input, RendersDoNotCallNotifyChanged) {
    Knobs k;
    KnobsTool *a = k.Add("A"), *b = k.Add("B");
    ASSERT_TRUE(b->FindInput("Notified")->ConnectTo(a->FindOutput("Value")));
    b->watch = "Notified";
    const int before = b->notifications.load() + a->notifications.load();
    for (double time : {0.0, 1.0, 2.0}) EXPECT_EQ(NumberOf(Evaluate(b->value, time)), 3.0);
    EXPECT_EQ(b->processCount, 3);
    EXPECT_EQ(b->notifications.load() + a->notifications.load(), before);
}

// Text as typed on a command line: script syntax where it parses, text as it stands for inputs that take text,
// a link only to a tool that exists.
TEST(InputValue, TextBecomesTheValueTheInputTakes) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    const struct {
        const char *input, *text;
        ScriptVal value;
    } cases[] = {
        {"Hard", "2.5", 2.5},
        {"Hard", "\"7\"", "7"},
        {"Hard", "Nope.Value", ScriptVal::Ref("Nope.Value")},
        {"Where", "{ 0.5, 0.25 }", ScriptVal::TableOf({}, {{1, 0.5}, {2, 0.25}})},
        {"Caption", "two words", "two words"},
        {"Caption", "\"quoted\"", "quoted"},
        {"Caption", "42", "42"},
        {"Caption", "K1", "K1"},
        {"Caption", "K1.Output", ScriptVal::Ref("K1.Output")},
        {"Caption", "Nope.Output", "Nope.Output"},
        {"File", "renders/a.####.exr", "renders/a.####.exr"},
        {"Mode", "ModeA", "ModeA"},
        {"Blend", "Soft Light", "Soft Light"},
        {"Blend", "1", 1},
    };
    for (const auto &c : cases)
        EXPECT_EQ(InputValueFromText(*k.doc, t->FindInput(c.input), c.text), c.value) << c.input << " = " << c.text;
    // A choice by name, as typed, sets its number.
    for (const auto &[text, choice] : {std::pair{"soft light", 1.0}, std::pair{"Normal", 0.0}}) {
        Input *blend = t->FindInput("Blend");
        EXPECT_EQ(ApplyInputValue(*k.doc, blend, InputValueFromText(*k.doc, blend, text)), "") << text;
        EXPECT_EQ(NumberOf(blend->Constant()), choice) << text;
    }

    const struct {
        const char *input, *text, *error;
    } refused[] = {
        {"Hard", "1 2", "expects a number or Tool.Output, not '1 2' (unexpected number after the value)"},
        {"Where", "{ 0.5",
         "expects a point { x, y } or Tool.Output, not '{ 0.5' (expected '}' to close table opened at line 1)"},
    };
    for (const auto &c : refused) {
        try {
            ADD_FAILURE() << "read as " << InputValueFromText(*k.doc, t->FindInput(c.input), c.text).ToText();
        } catch (const std::invalid_argument &e) {
            EXPECT_STREQ(e.what(), c.error);
        }
    }
}

TEST(InputValue, ChoicesListLabelsAndIDs) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    auto choices = [&](const char *id) {
        std::string out;
        for (const InputChoice &c : InputChoices(t->FindInput(id))) out += c.label + "=" + c.id + "; ";
        return out;
    };
    EXPECT_EQ(choices("Mode"), "A=ModeA; B=ModeB; ");
    EXPECT_EQ(choices("Blend"), "Normal=; Soft Light=; ");
    EXPECT_EQ(choices("Hard"), "");
}

} // namespace
} // namespace Orvane::inputtest
