// NotifyChanged: the main-thread hook a tool gets when an input that asks
// for it changes, and once for its first value.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include <fmt/format.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "tests/support/TestSupport.h"

namespace Orvane::notifytest {
namespace {

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
        if (auto *n = dynamic_cast<Number *>(param)) heard.push_back(fmt::format("{} {}", in->ID().Text(), n->value));
        ThreadedOperator::NotifyChanged(in, param, time, tags);
    }
    Input *loud, *quietStart, *silent;
    std::vector<std::string> heard;
};

TEST(NotifyChanged, FirstValuesAndChangesOfNotifyingInputsAreHeard) {
    static const OvID cls = Orvane::Test::RegisterTool("NotifyTestTool", &Orvane::Test::MakeTool<NotifyTool>,
                                                       {{RegNoBlendControls, 1}, {RegNoEffectMask, 1}});
    OrvaneDoc doc;
    auto *tool = dynamic_cast<NotifyTool *>(doc.AddTool(cls));
    ASSERT_NE(tool, nullptr);
    EXPECT_EQ(tool->heard, std::vector<std::string>{"Loud 0"}) << "QuietStart asks not to hear its first value";

    tool->heard.clear();
    ASSERT_TRUE(tool->loud->SetValue(MakeRef<Number>(2.5)));
    ASSERT_TRUE(tool->quietStart->SetValue(MakeRef<Number>(-1)));
    ASSERT_TRUE(tool->silent->SetValue(MakeRef<Number>(9)));
    AnimCurve curve;
    curve.SetKey(0, MakeRef<Number>(4));
    curve.SetKey(10, MakeRef<Number>(8));
    ASSERT_TRUE(tool->loud->SetCurve(curve)); // heard with its value at the document's start
    tool->loud->ResetValue();                 // heard with the default
    // A value the input refuses changes nothing and is not heard.
    EXPECT_FALSE(tool->loud->SetValue(MakeRef<Text>("x")));
    EXPECT_EQ(tool->heard, (std::vector<std::string>{"Loud 2.5", "QuietStart -1", "Loud 4", "Loud 0"}));
}

} // namespace
} // namespace Orvane::notifytest
