// Inputs: limits, integer rounding, types, links (and the loops they must
// not make), external and hidden inputs, run-time attribute changes, and the
// main-thread NotifyChanged hook staying out of renders.
#include <atomic>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
#include "tests/support/TestSupport.h"

namespace Orvane::inputtest {
namespace ts = ::Orvane::Test;
namespace {

/// A tool with one input of each kind the tests need. Its "Value" output is
/// the number that reached Process through the input named by `watch`.
class KnobsTool : public ThreadedOperator {
public:
    KnobsTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        AddInputTagList("Hard", "Hard",
                        {{LinkDataType, CLSID_DataType_Number},
                         {InputMinAllowed, -1.0},
                         {InputMaxAllowed, 10.0},
                         {InputSliderLow, 0.0},
                         {InputSliderHigh, 5.0},
                         {InputDefault, 2.0}});
        AddInputTagList("Slider", "Slider",
                        {{LinkDataType, CLSID_DataType_Number},
                         {InputSliderLow, 0.0},
                         {InputSliderHigh, 1.0},
                         {InputDefault, 0.5}});
        AddInputTagList("Count", "Count",
                        {{LinkDataType, CLSID_DataType_Number},
                         {InputInteger, 1},
                         {InputMinAllowed, -3.0},
                         {InputMaxAllowed, 8.0}});
        AddInputTagList("Where", "Where",
                        {{LinkDataType, CLSID_DataType_Point},
                         {InputMinAllowed, 0.0},
                         {InputMaxAllowed, 1.0},
                         {InputDefaultX, 0.5},
                         {InputDefaultY, 0.25}});
        AddInputTagList("Caption", "Caption", {{LinkDataType, CLSID_DataType_Text}, {InputDefaultText, "hello"}});
        AddInputTagList("Mode", "Mode",
                        {{LinkDataType, CLSID_DataType_OvID},
                         {InputDefaultId, OvID("ModeB")},
                         {ListAddItem, "A"},
                         {ListItemId, OvID("ModeA")},
                         {ListAddItem, "B"},
                         {ListItemId, OvID("ModeB")}});
        AddInputTagList("Hidden", "Hidden",
                        {{LinkDataType, CLSID_DataType_Number}, {ControlVisible, 0}, {InputDefault, 3.0}});
        AddInputTagList("Internal", "Internal",
                        {{LinkDataType, CLSID_DataType_Number}, {InputExternal, 0}, {InputDefault, 4.0}});
        AddInputTagList("Notified", "Notified",
                        {{LinkDataType, CLSID_DataType_Number}, {InputNotify, 1}, {InputDefault, 1.0}});
        AddInputTagList("Input", "Input", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {InputRequired, 0}});
        AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
        value = AddOutputTagList("Value", "Value", {{LinkDataType, CLSID_DataType_Number}});
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

TEST(Input, HardLimitsClampValuesAndSliderLimitsDoNot) {
    struct Case {
        const char *input;
        double set, stored;
    };
    const Case cases[] = {
        {"Hard", 4.5, 4.5},    {"Hard", 7.0, 7.0},   // beyond the slider, within the hard limits
        {"Hard", 11.0, 10.0},  {"Hard", -1.5, -1.0}, // beyond the hard limits
        {"Hard", -1.0, -1.0},  {"Hard", 10.0, 10.0}, // at them
        {"Slider", 3.5, 3.5},  {"Slider", -2.0, -2.0},
        {"Count", 2.4, 2.0},   {"Count", 2.6, 3.0}, // rounded
        {"Count", -1.4, -1.0}, {"Count", -2.6, -3.0},
        {"Count", 8.7, 8.0},   {"Count", -9.0, -3.0}, // rounded, then limited
    };
    Knobs k;
    KnobsTool *t = k.Add("K1");
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.input) + " = " + std::to_string(c.set));
        Input *in = t->FindInput(c.input);
        ASSERT_TRUE(in->SetValue(MakeRef<Number>(c.set)));
        EXPECT_EQ(NumberOf(in->Constant()), c.stored);
        EXPECT_EQ(NumberOf(in->ValueAt(0.0)), c.stored);
    }
    // Both parts of a point.
    Input *where = t->FindInput("Where");
    ASSERT_TRUE(where->SetValue(MakeRef<Point>(1.5, -0.25)));
    auto *p = dynamic_cast<const Point *>(where->Constant().Get());
    ASSERT_NE(p, nullptr);
    EXPECT_EQ(p->x, 1.0);
    EXPECT_EQ(p->y, 0.0);
}

TEST(Input, CurveKeysObeyTheHardLimits) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    struct Case {
        const char *input;
        double keys[3], stored[3];
    };
    const Case cases[] = {
        {"Hard", {-5.0, 3.0, 25.0}, {-1.0, 3.0, 10.0}},
        {"Slider", {-5.0, 0.5, 25.0}, {-5.0, 0.5, 25.0}},
        {"Count", {-7.0, 1.6, 9.2}, {-3.0, 2.0, 8.0}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.input);
        AnimCurve curve;
        for (int i = 0; i < 3; ++i) curve.SetKey(10.0 * i, MakeRef<Number>(c.keys[i]));
        Input *in = t->FindInput(c.input);
        ASSERT_TRUE(in->SetCurve(curve));
        ASSERT_TRUE(in->IsAnimated());
        ASSERT_EQ(in->Curve()->Keys().size(), 3u);
        for (int i = 0; i < 3; ++i) {
            EXPECT_EQ(NumberOf(in->Curve()->Keys()[i].value), c.stored[i]);
            EXPECT_EQ(NumberOf(in->ValueAt(10.0 * i)), c.stored[i]);
        }
    }
}

TEST(Input, ValuesOfTheWrongTypeAreRefused) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    struct Case {
        const char *input;
        Ref<Parameter> value;
    };
    const Case cases[] = {
        {"Hard", MakeRef<Text>("7")},
        {"Hard", MakeRef<Point>(1.0, 2.0)},
        {"Where", MakeRef<Number>(0.5)},
        {"Caption", MakeRef<Number>(1.0)},
        {"Caption", MakeRef<IDValue>(OvID("hello"))},
        {"Mode", MakeRef<Text>("ModeA")},
        {"Input", MakeRef<Number>(1.0)},
        {"Hard", nullptr},
    };
    for (const Case &c : cases) {
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
    for (const char *id : {"Hard", "Slider", "Count", "Where", "Caption", "Mode", "Hidden"})
        EXPECT_TRUE(t->FindInput(id)->IsDefault()) << id;
    EXPECT_EQ(NumberOf(t->FindInput("Hard")->Constant()), 2.0);
    EXPECT_EQ(dynamic_cast<const Text &>(*t->FindInput("Caption")->Constant()).value, "hello");
    EXPECT_EQ(dynamic_cast<const IDValue &>(*t->FindInput("Mode")->Constant()).value, OvID("ModeB"));
    const auto &where = dynamic_cast<const Point &>(*t->FindInput("Where")->Constant());
    EXPECT_EQ(where.x, 0.5);
    EXPECT_EQ(where.y, 0.25);

    Input *hard = t->FindInput("Hard");
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(3.0)));
    EXPECT_FALSE(hard->IsDefault());
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(2.0))); // an equal value, not the same object
    EXPECT_TRUE(hard->IsDefault());
    AnimCurve curve;
    curve.SetKey(0.0, MakeRef<Number>(2.0));
    ASSERT_TRUE(hard->SetCurve(curve));
    EXPECT_FALSE(hard->IsDefault()) << "an animated input is not at its default";
    hard->ResetValue();
    EXPECT_TRUE(hard->IsDefault());
    EXPECT_FALSE(hard->IsAnimated());
    // A value that rounds to the default is the default.
    ASSERT_TRUE(t->FindInput("Count")->SetValue(MakeRef<Number>(0.3)));
    EXPECT_TRUE(t->FindInput("Count")->IsDefault());
}

TEST(Input, ConnectToChecksTypesAndRefusesLoops) {
    Knobs k;
    KnobsTool *a = k.Add("A");
    KnobsTool *b = k.Add("B");
    KnobsTool *c = k.Add("C");
    struct Case {
        const char *name;
        Input *in;
        Output *out;
        bool ok;
    };
    // Links first made: B.Input <- A.Output, C.Input <- B.Output (A -> B -> C).
    ASSERT_TRUE(b->FindInput("Input")->ConnectTo(a->FindOutput("Output")));
    ASSERT_TRUE(c->FindInput("Input")->ConnectTo(b->FindOutput("Output")));
    const Case cases[] = {
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
    for (const Case &t : cases) {
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
    KnobsTool *a = k.Add("A");
    KnobsTool *b = k.Add("B");
    Input *hard = b->FindInput("Hard");
    ASSERT_TRUE(hard->ConnectTo(a->FindOutput("Value")));
    EXPECT_FALSE(hard->IsDefault());
    EXPECT_FALSE(hard->ValueAt(0.0)) << "a linked input has no value of its own";
    hard->Disconnect();
    EXPECT_EQ(hard->Link(), nullptr);
    EXPECT_TRUE(a->FindOutput("Value")->Consumers().empty());
    EXPECT_TRUE(hard->IsDefault());
    hard->Disconnect(); // again: nothing happens

    ASSERT_TRUE(hard->ConnectTo(a->FindOutput("Value")));
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(6.0)));
    EXPECT_EQ(hard->Link(), nullptr);
    EXPECT_TRUE(a->FindOutput("Value")->Consumers().empty());
    // Once the link is gone, the other way round is no longer a loop.
    Input *back = a->FindInput("Hard");
    EXPECT_TRUE(back->ConnectTo(b->FindOutput("Value")));
}

TEST(Input, AHiddenControlStillDeliversItsValue) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    Input *hidden = t->FindInput("Hidden");
    EXPECT_FALSE(hidden->IsVisible());
    ASSERT_TRUE(hidden->SetValue(MakeRef<Number>(7.5)));
    EXPECT_EQ(NumberOf(Evaluate(t->value, 0.0)), 7.5);
    // Hidden at run time, after the value was set.
    Input *hard = t->FindInput("Hard");
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(6.25)));
    hard->SetAttrsTagList({{ControlVisible, 0}});
    EXPECT_FALSE(hard->IsVisible());
    t->watch = "Hard";
    EXPECT_EQ(NumberOf(Evaluate(t->value, 1.0)), 6.25);
}

TEST(Input, SetAttrsTagListChangesTagsAtRunTime) {
    Knobs k;
    KnobsTool *t = k.Add("K1");
    Input *hard = t->FindInput("Hard");
    EXPECT_TRUE(hard->IsVisible());
    hard->SetAttrsTagList({{ControlVisible, 0}});
    EXPECT_FALSE(hard->IsVisible());
    hard->SetAttrsTagList({{ControlVisible, 1}, {ControlLabel, "Strength"}});
    EXPECT_TRUE(hard->IsVisible());
    EXPECT_STREQ(hard->Label(), "Strength");
    // New limits hold for values set afterwards.
    hard->SetAttrsTagList({{InputMaxAllowed, 3.0}});
    ASSERT_TRUE(hard->SetValue(MakeRef<Number>(9.0)));
    EXPECT_EQ(NumberOf(hard->Constant()), 3.0);
    EXPECT_EQ(hard->Tags().GetDouble(InputMinAllowed), -1.0) << "other tags stay";
}

TEST(Input, AnInternalInputTakesNoLinkAndNoCurve) {
    Knobs k;
    KnobsTool *a = k.Add("A");
    KnobsTool *b = k.Add("B");
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
    KnobsTool *a = k.Add("A");
    KnobsTool *b = k.Add("B");
    ASSERT_TRUE(b->FindInput("Notified")->ConnectTo(a->FindOutput("Value")));
    b->watch = "Notified";
    const int before = b->notifications.load() + a->notifications.load();
    for (double time : {0.0, 1.0, 2.0}) EXPECT_EQ(NumberOf(Evaluate(b->value, time)), 3.0);
    EXPECT_EQ(b->processCount, 3);
    EXPECT_EQ(b->notifications.load() + a->notifications.load(), before);
}

} // namespace
} // namespace Orvane::inputtest
