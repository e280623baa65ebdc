// NotifyChanged: the main-thread hook a tool gets when an input that asks
// for it changes, and once for its first value.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane::notifytest {
namespace {

struct Heard {
    std::string input;
    double value;
};

class NotifyTool : public ThreadedOperator {
public:
    NotifyTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        loud = AddInputTagList("Loud", "Loud", {{LinkDataType, CLSID_DataType_Number}, {InputNotify, 1}});
        quietStart =
            AddInputTagList("QuietStart", "QuietStart",
                            {{LinkDataType, CLSID_DataType_Number}, {InputNotify, 1}, {InputInitialNotify, 0}});
        silent = AddInputTagList("Silent", "Silent", {{LinkDataType, CLSID_DataType_Number}});
        AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Number}});
    }
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override {
        if (auto *n = dynamic_cast<Number *>(param)) heard.push_back({in->ID().Text(), n->value});
        ThreadedOperator::NotifyChanged(in, param, time, tags);
    }
    Input *loud, *quietStart, *silent;
    std::vector<Heard> heard;
};

Object *MakeNotifyTool(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new NotifyTool(reg, args, tags);
}

const OvID NotifyClass("NotifyTestTool");

void RegisterOnce() {
    static const Registry *row = [] {
        TagList tags{{RegConstructor, &MakeNotifyTool},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1}};
        return Registry::_Init(&ClassRegistry, NotifyClass, tags);
    }();
    (void)row;
}

TEST(NotifyChanged, FirstValuesReachTheToolUnlessAnInputAsksNotTo) {
    RegisterOnce();
    OrvaneDoc doc;
    auto *tool = dynamic_cast<NotifyTool *>(doc.AddTool(NotifyClass));
    ASSERT_NE(tool, nullptr);
    ASSERT_EQ(tool->heard.size(), 1u);
    EXPECT_EQ(tool->heard[0].input, "Loud");
}

TEST(NotifyChanged, ChangesOfNotifyingInputsAreHeardAndOthersAreNot) {
    RegisterOnce();
    OrvaneDoc doc;
    auto *tool = dynamic_cast<NotifyTool *>(doc.AddTool(NotifyClass));
    ASSERT_NE(tool, nullptr);
    tool->heard.clear();
    ASSERT_TRUE(tool->loud->SetValue(MakeRef<Number>(2.5)));
    ASSERT_TRUE(tool->quietStart->SetValue(MakeRef<Number>(-1)));
    ASSERT_TRUE(tool->silent->SetValue(MakeRef<Number>(9)));
    AnimCurve curve;
    curve.SetKey(0, MakeRef<Number>(4));
    curve.SetKey(10, MakeRef<Number>(8));
    ASSERT_TRUE(tool->loud->SetCurve(curve));
    tool->loud->ResetValue();
    ASSERT_EQ(tool->heard.size(), 4u);
    EXPECT_EQ(tool->heard[0].input, "Loud");
    EXPECT_EQ(tool->heard[0].value, 2.5);
    EXPECT_EQ(tool->heard[1].input, "QuietStart");
    EXPECT_EQ(tool->heard[1].value, -1);
    EXPECT_EQ(tool->heard[2].value, 4) << "a curve is heard with its value at the document's start";
    EXPECT_EQ(tool->heard[3].value, 0) << "a reset is heard with the default";
    // A value the input refuses changes nothing and is not heard.
    EXPECT_FALSE(tool->loud->SetValue(MakeRef<Text>("x")));
    EXPECT_EQ(tool->heard.size(), 4u);
}

} // namespace
} // namespace Orvane::notifytest
