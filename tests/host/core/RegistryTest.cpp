#include "host/core/Registry.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstring>
#include <future>
#include <memory>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "host/core/ScriptVal.h"
#include "host/core/Tags.h"

namespace Orvane::regtest {
namespace {

// Every test enters its rows into a list of its own and deletes it at the end.
struct LocalList {
    RegistryList *list = nullptr;
    ~LocalList() { delete list; }
    Registry *Add(const char *id, TagList tags) { return Registry::_Init(&list, OvID(id), tags); }
    const Registry *Find(const char *id, uint32_t type = 0) const { return list->Find(OvID(id), type); }
    std::vector<std::string> Ids() const {
        std::vector<std::string> ids;
        for (const Registry *r : list->Rows()) ids.push_back(r->ID().Text());
        return ids;
    }
};

struct Widget : Object {
    Widget(const Registry *reg, double arg, const void *doc) : seenReg(reg), arg(arg), doc(doc) {}
    const Registry *seenReg;
    double arg;
    const void *doc;
};

Object *MakeWidget(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new Widget(reg, args.IsNumber() ? args.AsNumber() : -1.0, tags.GetPtr(ImgDocument));
}
Object *MakeNothing(const Registry *, const ScriptVal &, const TagList &) { return nullptr; }

// Start-up and clean-up hooks that log their calls.
std::vector<std::string> hookLog;
bool AcceptInit(Registry *reg) { return hookLog.push_back(std::string("accept ") + reg->ID().Text()), true; }
bool RefuseInit(Registry *reg) { return hookLog.push_back(std::string("refuse ") + reg->ID().Text()), false; }
void LogCleanup(Registry *reg) { hookLog.push_back(std::string("cleanup ") + reg->ID().Text()); }
// A hook that looks at the registry while it runs: its base class and itself.
bool LookupInit(Registry *reg) {
    hookLog.push_back(std::string("base ") + (reg->Base() ? reg->Base()->ID().Text() : "none") +
                      (reg->IsClassType(reg->ID()) ? ", self" : ""));
    return true;
}

TEST(RegistryFind, ByIdAndByOldIdsInRegistrationOrderAndEachRowKeepsItsOwnTags) {
    LocalList l;
    Registry *a = l.Add("RegTestA", {{RegOldClassId, "RegTestOldA"}, {RegOldClassId, "RegTestOlderA"}});
    Registry *b = l.Add("RegTestB", {{RegOldClassId, "RegTestA2"}});
    Registry *c = l.Add("RegTestA2", {});
    const std::pair<const char *, const Registry *> cases[] = {
        {"RegTestA", a}, {"RegTestOldA", a}, {"RegTestOlderA", a},
        {"RegTestB", b}, {"RegTestA2", c},   {"RegTestMissing", nullptr},
    }; // RegTestA2: a class ID comes before another's old ID
    for (const auto &[id, row] : cases) EXPECT_EQ(l.Find(id), row) << id;
    EXPECT_EQ(l.list->Find(OvID()), nullptr);
    // Rows list in registration order, whatever their names and hashes.
    std::vector<std::string> expected{"RegTestA", "RegTestB", "RegTestA2"};
    for (int i = 0; i < 40; ++i)
        expected.push_back(l.Add(("RegTestOrder" + std::to_string((i * 17) % 40)).c_str(), {})->ID().Text());
    EXPECT_EQ(l.Ids(), expected);
    EXPECT_EQ(l.list->Size(), 43u);
    char name[] = "Display Name", word[] = "ClassWord";
    Registry *row = l.Add("RegTestCopy", {{RegName, name}, {RegClassName, word}, {RegTypeFlags, 5}});
    std::memset(name, '!', std::strlen(name));
    std::memset(word, '!', std::strlen(word));
    EXPECT_EQ(std::string(row->DisplayName()) + "/" + row->ClassName(), "Display Name/ClassWord");
    EXPECT_EQ(row->TypeFlags(), 5u);
    // Without names the class word is the ID and the display name the class word.
    Registry *bare = l.Add("RegTestBare", {});
    EXPECT_EQ(std::string(bare->DisplayName()) + "/" + bare->ClassName(), "RegTestBare/RegTestBare");
    EXPECT_STREQ(l.Add("RegTestWorded", {{RegClassName, "Worded"}})->DisplayName(), "Worded");
}

TEST(RegistryTypes, LowBitsAndFamilyAndClassTypesFollowTheBaseChain) {
    LocalList l;
    const Registry *data = l.Add("RegTestData", {{RegTypeFlags, RegKindOperator | RegKindTool | RegFamilyDataType}});
    const Registry *plain = l.Add("RegTestPlain", {{RegTypeFlags, RegKindOperator | RegKindSource}});
    const Registry *none = l.Add("RegTestNoFlags", {});
    // Every low bit asked for must be there; a family must match whole (the bits of 0x00070000 and 0x00130000 lie
    // inside the row's family). The types each row is, and those it is not.
    const std::tuple<const Registry *, std::vector<uint32_t>, std::vector<uint32_t>> cases[] = {
        {data,
         {0, RegKindOperator | RegKindTool, RegFamilyDataType, RegFamilyDataType | RegKindTool},
         {RegKindOperator | RegKindSource, RegFamilyDataType | RegKindMask, RegFamilyImageFormat | RegKindOperator,
          0x00070000, 0x00130000}},
        {plain, {RegKindOperator | RegKindSource}, {RegFamilyDataType}},
        {none, {0}, {RegKindOperator, RegFamilyShape}},
    };
    for (const auto &[row, are, areNot] : cases)
        for (const bool is : {true, false})
            for (const uint32_t type : is ? are : areNot) {
                SCOPED_TRACE(testing::Message() << row->ID().Text() << std::hex << " type 0x" << type);
                EXPECT_EQ(row->IsRegClassType(type), is);
                EXPECT_EQ(l.list->Find(row->ID(), type), is ? row : nullptr);
            }
    static const OvID baseId("RegTestBase"), midId("RegTestMid"), foreignId("RegTestForeign");
    const Registry *base = l.Add("RegTestBase", {});
    const Registry *mid = l.Add("RegTestMid", {{RegBaseClass, &baseId}});
    const Registry *leaf = l.Add("RegTestLeaf", {{RegBaseClass, &midId}});
    const Registry *other = l.Add("RegTestOtherLeaf", {{RegBaseClass, &foreignId}}); // base not registered
    EXPECT_EQ(std::vector({base->Base(), mid->Base(), leaf->Base(), other->Base()}),
              std::vector<const Registry *>({nullptr, base, mid, nullptr}));
    EXPECT_TRUE(other->BaseID() == foreignId && base->BaseID().IsNull());
    const std::tuple<const Registry *, const char *, bool> chain[] = {
        {leaf, "RegTestLeaf", true},       {leaf, "RegTestMid", true},      {leaf, "RegTestBase", true},
        {leaf, "RegTestOtherLeaf", false}, {mid, "RegTestBase", true},      {mid, "RegTestLeaf", false},
        {base, "RegTestBase", true},       {base, "RegTestMid", false},     {other, "RegTestForeign", true},
        {other, "RegTestBase", false},     {leaf, "RegTestUnknown", false},
    };
    for (const auto &[row, id, is] : chain)
        EXPECT_EQ(row->IsClassType(OvID(id)), is) << row->ID().Text() << " is " << id;
}

TEST(RegistryNew, FactoriesMakeObjects) {
    LocalList l;
    const Registry *made = l.Add("RegTestMade", {{RegConstructor, &MakeWidget}});
    const Registry *failing = l.Add("RegTestFailing", {{RegConstructor, &MakeNothing}});
    const Registry *abstract = l.Add("RegTestAbstract", {});
    EXPECT_TRUE(made->CanCreate() && failing->CanCreate() && !abstract->CanCreate());
    std::unique_ptr<Object> obj(made->New(ScriptVal(42.0), TagList()));
    auto *w = dynamic_cast<Widget *>(obj.get());
    ASSERT_NE(w, nullptr);
    EXPECT_EQ(std::tuple(w->seenReg, w->arg, obj->GetRegistry()), std::tuple(made, 42.0, made));
    EXPECT_FALSE(failing->New(ScriptVal(), TagList()) || abstract->New(ScriptVal(), TagList()));
    // The list's New finds the class and passes the document on.
    int marker = 0;
    auto *doc = reinterpret_cast<OrvaneDoc *>(&marker); // only carried, never used
    std::unique_ptr<Object> byId(l.list->New(OvID("RegTestMade"), 0, doc));
    ASSERT_NE(dynamic_cast<Widget *>(byId.get()), nullptr);
    EXPECT_EQ(std::pair(dynamic_cast<Widget *>(byId.get())->doc, byId->GetRegistry()),
              std::pair(static_cast<const void *>(&marker), made));
    for (const char *id : {"RegTestFailing", "RegTestAbstract", "RegTestNowhere"})
        EXPECT_EQ(l.list->New(OvID(id), 0, nullptr), nullptr) << id;
    EXPECT_EQ(l.list->New(OvID("RegTestMade"), RegKindTool, nullptr), nullptr) << "the wrong type";
}

TEST(RegistryInit, RefusedRowsAreDisabledAndStartUpHooksMayLookUpTheList) {
    hookLog.clear();
    LocalList l;
    Registry *yes =
        l.Add("RegTestYes", {{RegInitFunc, &AcceptInit}, {RegConstructor, &MakeWidget}, {RegCleanupFunc, &LogCleanup}});
    Registry *no = l.Add("RegTestNo",
                         {{RegInitFunc, &RefuseInit}, {RegConstructor, &MakeWidget}, {RegOldClassId, "RegTestOldNo"}});
    Registry *plain = l.Add("RegTestNoHook", {{RegCleanupFunc, &LogCleanup}});
    EXPECT_TRUE(hookLog.empty()) << "nothing runs before InitAll";
    l.list->InitAll();
    l.list->InitAll(); // once only
    EXPECT_EQ(hookLog, (std::vector<std::string>{"accept RegTestYes", "refuse RegTestNo"}));
    EXPECT_TRUE(yes->IsEnabled() && !no->IsEnabled() && plain->IsEnabled());
    EXPECT_TRUE(!l.Find("RegTestNo") && !l.Find("RegTestOldNo") && l.Find("RegTestYes") == yes);
    EXPECT_FALSE(no->New(ScriptVal(), TagList()) || l.list->New(OvID("RegTestNo"), 0, nullptr));
    EXPECT_EQ(l.list->Size(), 2u);
    // Rows entered after InitAll start at once.
    hookLog.clear();
    EXPECT_TRUE(l.Add("RegTestLate", {{RegInitFunc, &AcceptInit}})->IsEnabled());
    EXPECT_FALSE(l.Add("RegTestLateNo", {{RegInitFunc, &RefuseInit}})->IsEnabled());
    EXPECT_EQ(l.Find("RegTestLateNo"), nullptr);
    EXPECT_EQ(l.Ids(), (std::vector<std::string>{"RegTestYes", "RegTestNoHook", "RegTestLate"}));
    l.list->CleanupAll();
    EXPECT_EQ(hookLog, (std::vector<std::string>{"accept RegTestLate", "refuse RegTestLateNo", "cleanup RegTestYes",
                                                 "cleanup RegTestNoHook"}));
    static const OvID baseId("RegTestHookBase");
    hookLog.clear();
    LocalList hooked;
    hooked.Add("RegTestHookBase", {});
    hooked.Add("RegTestHookEarly", {{RegBaseClass, &baseId}, {RegInitFunc, &LookupInit}});
    hooked.list->InitAll();
    // The same hook on a row entered after InitAll. Run on a thread of its own so that a hook blocked on the list's
    // lock fails the test instead of hanging it.
    auto done = std::make_shared<std::promise<void>>();
    std::future<void> finished = done->get_future();
    std::thread([listRef = &hooked.list, done] {
        TagList tags{{RegBaseClass, &baseId}, {RegInitFunc, &LookupInit}};
        Registry::_Init(listRef, OvID("RegTestHookLate"), tags);
        done->set_value();
    }).detach();
    if (finished.wait_for(std::chrono::seconds(20)) != std::future_status::ready) {
        hooked.list = nullptr; // the blocked thread still uses it: leave it alive
        FAIL() << "a start-up hook of a late row blocked on the registry lock";
    }
    EXPECT_EQ(hookLog, (std::vector<std::string>{"base RegTestHookBase, self", "base RegTestHookBase, self"}));
}

TEST(RegistryRemove, TakesRowsOut) {
    LocalList l;
    const Registry *a = l.Add("RegTestRemA", {{RegOldClassId, "RegTestRemOldA"}});
    const Registry *b = l.Add("RegTestRemB", {{RegOldClassId, "RegTestRemOldB"}, {RegOldClassId, "RegTestRemOldB2"}});
    const Registry *c = l.Add("RegTestRemC", {{RegOldClassId, "RegTestRemOldC"}});
    l.list->Remove(b);
    EXPECT_EQ(l.Ids(), (std::vector<std::string>{"RegTestRemA", "RegTestRemC"}));
    for (const char *gone : {"RegTestRemB", "RegTestRemOldB", "RegTestRemOldB2"})
        EXPECT_EQ(l.Find(gone), nullptr) << gone;
    EXPECT_TRUE(l.Find("RegTestRemOldA") == a && l.Find("RegTestRemOldC") == c);
    // A row that is not in this list is ignored.
    LocalList other;
    const Registry *foreign = other.Add("RegTestRemForeign", {});
    l.list->Remove(foreign);
    EXPECT_TRUE(l.list->Size() == 2u && other.Find("RegTestRemForeign") == foreign);
    // A second row with the same ID hides the first until it is removed.
    const Registry *shadow = l.Add("RegTestRemA", {});
    EXPECT_EQ(l.Find("RegTestRemA"), shadow);
    l.list->Remove(shadow);
    EXPECT_EQ(l.Find("RegTestRemA"), a);
    l.list->Remove(a);
    l.list->Remove(c);
    EXPECT_TRUE(l.list->Size() == 0u && l.list->Rows().empty());
}

} // namespace
} // namespace Orvane::regtest
