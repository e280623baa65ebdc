#include "host/core/Registry.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstring>
#include <future>
#include <memory>
#include <string>
#include <thread>
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
};

class Widget : public Object {
public:
    Widget(const Registry *reg, double arg, const void *doc) : seenReg(reg), arg(arg), doc(doc) {}
    const Registry *seenReg;
    double arg;
    const void *doc;
};

Object *MakeWidget(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new Widget(reg, args.IsNumber() ? args.AsNumber() : -1.0, tags.GetPtr(ImgDocument));
}

Object *MakeNothing(const Registry *, const ScriptVal &, const TagList &) { return nullptr; }

// Start-up hooks that count their calls.
int acceptCalls = 0, refuseCalls = 0, cleanupCalls = 0;
std::vector<Registry *> initSeen;
bool AcceptInit(Registry *reg) {
    ++acceptCalls;
    initSeen.push_back(reg);
    return true;
}
bool RefuseInit(Registry *reg) {
    ++refuseCalls;
    initSeen.push_back(reg);
    return false;
}
void CountCleanup(Registry *) { ++cleanupCalls; }

// A hook that looks at the registry while it runs: its base class and itself.
const Registry *lookupBase = nullptr;
bool lookupFoundSelf = false;
bool LookupInit(Registry *reg) {
    lookupBase = reg->Base();
    lookupFoundSelf = reg->IsClassType(reg->ID());
    return true;
}

void ResetCounters() {
    acceptCalls = refuseCalls = cleanupCalls = 0;
    initSeen.clear();
}

std::vector<std::string> RowIds(const RegistryList &list) {
    std::vector<std::string> ids;
    for (const Registry *r : list.Rows()) ids.push_back(r->ID().Text());
    return ids;
}

// ---------------------------------------------------------------------------------------------------------------

TEST(RegistryFind, ByIdAndByOldIds) {
    LocalList l;
    Registry *a = l.Add("RegTestA", {{RegOldClassId, "RegTestOldA"}, {RegOldClassId, "RegTestOlderA"}});
    Registry *b = l.Add("RegTestB", {{RegOldClassId, "RegTestA2"}});
    Registry *c = l.Add("RegTestA2", {});
    ASSERT_NE(l.list, nullptr);

    struct Case {
        const char *id;
        const Registry *row;
    };
    const Case cases[] = {{"RegTestA", a},
                          {"RegTestOldA", a},
                          {"RegTestOlderA", a},
                          {"RegTestB", b},
                          {"RegTestA2", c}, // a class ID comes before another's old ID
                          {"RegTestMissing", nullptr}};
    for (const Case &cs : cases) {
        SCOPED_TRACE(cs.id);
        EXPECT_EQ(l.list->Find(OvID(cs.id)), cs.row);
    }
    EXPECT_EQ(l.list->Find(OvID()), nullptr);
    EXPECT_EQ(a->ID(), OvID("RegTestA"));
    EXPECT_EQ(l.list->Size(), 3u);
}

TEST(RegistryFind, RowKeepsItsOwnCopyOfTheTags) {
    LocalList l;
    char name[] = "Display Name";
    char word[] = "ClassWord";
    Registry *row = l.Add("RegTestCopy", {{RegName, name}, {RegClassName, word}, {RegTypeFlags, 5}});
    std::memset(name, '!', std::strlen(name));
    std::memset(word, '!', std::strlen(word));
    EXPECT_STREQ(row->DisplayName(), "Display Name");
    EXPECT_STREQ(row->ClassName(), "ClassWord");
    EXPECT_EQ(row->TypeFlags(), 5u);
    EXPECT_EQ(row->Tags().Size(), 3u);

    // Without names the class word is the ID and the display name the class word.
    Registry *bare = l.Add("RegTestBare", {});
    EXPECT_STREQ(bare->ClassName(), "RegTestBare");
    EXPECT_STREQ(bare->DisplayName(), "RegTestBare");
    Registry *worded = l.Add("RegTestWorded", {{RegClassName, "Worded"}});
    EXPECT_STREQ(worded->DisplayName(), "Worded");
}

TEST(RegistryTypes, LowBitsAndFamily) {
    LocalList l;
    const Registry *dataType =
        l.Add("RegTestDataType", {{RegTypeFlags, RegKindOperator | RegKindTool | RegFamilyDataType}});
    const Registry *plain = l.Add("RegTestPlain", {{RegTypeFlags, RegKindOperator | RegKindSource}});
    const Registry *none = l.Add("RegTestNoFlags", {});

    struct Case {
        const Registry *row;
        uint32_t type;
        bool is;
    };
    const Case cases[] = {
        {dataType, 0, true},
        {dataType, RegKindOperator, true},
        {dataType, RegKindOperator | RegKindTool, true},
        {dataType, RegKindSource, false},
        {dataType, RegKindOperator | RegKindSource, false},
        {dataType, RegFamilyDataType, true},
        {dataType, RegFamilyDataType | RegKindTool, true},
        {dataType, RegFamilyDataType | RegKindMask, false},
        {dataType, RegFamilyImageFormat, false},
        {dataType, RegFamilyImageFormat | RegKindOperator, false},
        {dataType, 0x00070000, false}, // a family whose bits lie inside the row's family is another family
        {dataType, 0x00130000, false},
        {plain, RegKindSource, true},
        {plain, RegKindOperator | RegKindSource, true},
        {plain, RegFamilyDataType, false},
        {plain, RegKindTool, false},
        {none, 0, true},
        {none, RegKindOperator, false},
        {none, RegFamilyShape, false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.row->ID().Text() << std::hex << " type 0x" << c.type);
        EXPECT_EQ(c.row->IsRegClassType(c.type), c.is);
        EXPECT_EQ(l.list->Find(c.row->ID(), c.type), c.is ? c.row : nullptr);
    }
}

TEST(RegistryTypes, ClassTypeFollowsTheBaseChain) {
    static const OvID baseId("RegTestBase"), midId("RegTestMid"), foreignId("RegTestForeign");
    LocalList l;
    const Registry *base = l.Add("RegTestBase", {});
    const Registry *mid = l.Add("RegTestMid", {{RegBaseClass, &baseId}});
    const Registry *leaf = l.Add("RegTestLeaf", {{RegBaseClass, &midId}});
    const Registry *other = l.Add("RegTestOtherLeaf", {{RegBaseClass, &foreignId}}); // base not registered

    EXPECT_EQ(base->Base(), nullptr);
    EXPECT_EQ(mid->Base(), base);
    EXPECT_EQ(leaf->Base(), mid);
    EXPECT_EQ(leaf->BaseID(), midId);
    EXPECT_EQ(other->Base(), nullptr);
    EXPECT_EQ(other->BaseID(), foreignId);
    EXPECT_TRUE(base->BaseID().IsNull());

    struct Case {
        const Registry *row;
        const char *id;
        bool is;
    };
    const Case cases[] = {
        {leaf, "RegTestLeaf", true},       {leaf, "RegTestMid", true},      {leaf, "RegTestBase", true},
        {leaf, "RegTestOtherLeaf", false}, {mid, "RegTestBase", true},      {mid, "RegTestLeaf", false},
        {base, "RegTestBase", true},       {base, "RegTestMid", false},     {other, "RegTestForeign", true},
        {other, "RegTestBase", false},     {leaf, "RegTestUnknown", false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.row->ID().Text() << " is " << c.id);
        EXPECT_EQ(c.row->IsClassType(OvID(c.id)), c.is);
    }
}

TEST(RegistryNew, FactoriesMakeObjects) {
    LocalList l;
    const Registry *made = l.Add("RegTestMade", {{RegConstructor, &MakeWidget}});
    const Registry *failing = l.Add("RegTestFailing", {{RegConstructor, &MakeNothing}});
    const Registry *abstract = l.Add("RegTestAbstract", {});

    EXPECT_TRUE(made->CanCreate());
    EXPECT_TRUE(failing->CanCreate());
    EXPECT_FALSE(abstract->CanCreate());

    std::unique_ptr<Object> obj(made->New(ScriptVal(42.0), TagList()));
    ASSERT_NE(obj, nullptr);
    auto *w = dynamic_cast<Widget *>(obj.get());
    ASSERT_NE(w, nullptr);
    EXPECT_EQ(w->seenReg, made);
    EXPECT_EQ(w->arg, 42.0);
    EXPECT_EQ(obj->GetRegistry(), made);

    std::unique_ptr<Object> viaNewObj(NewObj(*made, ScriptVal(7.0), TagList()));
    ASSERT_NE(viaNewObj, nullptr);
    EXPECT_EQ(dynamic_cast<Widget *>(viaNewObj.get())->arg, 7.0);

    EXPECT_EQ(failing->New(ScriptVal(), TagList()), nullptr);
    EXPECT_EQ(abstract->New(ScriptVal(), TagList()), nullptr);

    // The list's New finds the class and passes the document on.
    int marker = 0;
    auto *doc = reinterpret_cast<OrvaneDoc *>(&marker); // only carried, never used
    std::unique_ptr<Object> byId(l.list->New(OvID("RegTestMade"), 0, doc));
    ASSERT_NE(byId, nullptr);
    EXPECT_EQ(dynamic_cast<Widget *>(byId.get())->doc, &marker);
    EXPECT_EQ(byId->GetRegistry(), made);
    EXPECT_EQ(l.list->New(OvID("RegTestFailing"), 0, nullptr), nullptr);
    EXPECT_EQ(l.list->New(OvID("RegTestAbstract"), 0, nullptr), nullptr);
    EXPECT_EQ(l.list->New(OvID("RegTestNowhere"), 0, nullptr), nullptr);
    EXPECT_EQ(l.list->New(OvID("RegTestMade"), RegKindTool, nullptr), nullptr); // wrong type
}

TEST(RegistryInit, RefusedRowsAreDisabled) {
    ResetCounters();
    LocalList l;
    Registry *yes = l.Add("RegTestYes",
                          {{RegInitFunc, &AcceptInit}, {RegConstructor, &MakeWidget}, {RegCleanupFunc, &CountCleanup}});
    Registry *no = l.Add("RegTestNo",
                         {{RegInitFunc, &RefuseInit}, {RegConstructor, &MakeWidget}, {RegOldClassId, "RegTestOldNo"}});
    Registry *plain = l.Add("RegTestNoHook", {{RegCleanupFunc, &CountCleanup}});
    EXPECT_EQ(acceptCalls + refuseCalls, 0); // nothing runs before InitAll
    EXPECT_EQ(RowIds(*l.list), (std::vector<std::string>{"RegTestYes", "RegTestNo", "RegTestNoHook"}));

    l.list->InitAll();
    EXPECT_EQ(acceptCalls, 1);
    EXPECT_EQ(refuseCalls, 1);
    EXPECT_EQ(initSeen, (std::vector<Registry *>{yes, no}));
    EXPECT_TRUE(yes->IsEnabled());
    EXPECT_FALSE(no->IsEnabled());
    EXPECT_TRUE(plain->IsEnabled());
    EXPECT_EQ(l.list->Find(OvID("RegTestNo")), nullptr);
    EXPECT_EQ(l.list->Find(OvID("RegTestOldNo")), nullptr);
    EXPECT_EQ(l.list->Find(OvID("RegTestYes")), yes);
    EXPECT_EQ(no->New(ScriptVal(), TagList()), nullptr);
    EXPECT_EQ(l.list->New(OvID("RegTestNo"), 0, nullptr), nullptr);
    EXPECT_EQ(RowIds(*l.list), (std::vector<std::string>{"RegTestYes", "RegTestNoHook"}));
    EXPECT_EQ(l.list->Size(), 2u);

    l.list->InitAll(); // once only
    EXPECT_EQ(acceptCalls, 1);
    EXPECT_EQ(refuseCalls, 1);

    // Rows entered after InitAll start at once.
    Registry *late = l.Add("RegTestLate", {{RegInitFunc, &AcceptInit}});
    EXPECT_EQ(acceptCalls, 2);
    EXPECT_EQ(initSeen.back(), late);
    EXPECT_TRUE(late->IsEnabled());
    Registry *lateNo = l.Add("RegTestLateNo", {{RegInitFunc, &RefuseInit}});
    EXPECT_EQ(refuseCalls, 2);
    EXPECT_FALSE(lateNo->IsEnabled());
    EXPECT_EQ(l.list->Find(OvID("RegTestLateNo")), nullptr);
    EXPECT_EQ(RowIds(*l.list), (std::vector<std::string>{"RegTestYes", "RegTestNoHook", "RegTestLate"}));

    l.list->CleanupAll();
    EXPECT_EQ(cleanupCalls, 2);
}

TEST(RegistryInit, StartUpHooksMayLookUpTheList) {
    static const OvID baseId("RegTestHookBase");
    LocalList l;
    const Registry *base = l.Add("RegTestHookBase", {});
    l.Add("RegTestHookEarly", {{RegBaseClass, &baseId}, {RegInitFunc, &LookupInit}});
    lookupBase = nullptr;
    lookupFoundSelf = false;
    l.list->InitAll();
    EXPECT_EQ(lookupBase, base);
    EXPECT_TRUE(lookupFoundSelf);

    // The same hook on a row entered after InitAll. Run on a thread of its own
    // so that a hook blocked on the list's lock fails the test instead of
    // hanging it.
    lookupBase = nullptr;
    lookupFoundSelf = false;
    auto done = std::make_shared<std::promise<void>>();
    std::future<void> finished = done->get_future();
    RegistryList **listRef = &l.list;
    std::thread([listRef, done] {
        TagList tags{{RegBaseClass, &baseId}, {RegInitFunc, &LookupInit}};
        Registry::_Init(listRef, OvID("RegTestHookLate"), tags);
        done->set_value();
    }).detach();
    if (finished.wait_for(std::chrono::seconds(20)) != std::future_status::ready) {
        l.list = nullptr; // the blocked thread still uses it: leave it alive
        FAIL() << "a start-up hook of a late row blocked on the registry lock";
    }
    EXPECT_EQ(lookupBase, base);
    EXPECT_TRUE(lookupFoundSelf);
}

TEST(RegistryRemove, TakesRowsOut) {
    LocalList l;
    const Registry *a = l.Add("RegTestRemA", {{RegOldClassId, "RegTestRemOldA"}});
    const Registry *b = l.Add("RegTestRemB", {{RegOldClassId, "RegTestRemOldB"}, {RegOldClassId, "RegTestRemOldB2"}});
    const Registry *c = l.Add("RegTestRemC", {{RegOldClassId, "RegTestRemOldC"}});

    l.list->Remove(b);
    EXPECT_EQ(RowIds(*l.list), (std::vector<std::string>{"RegTestRemA", "RegTestRemC"}));
    for (const char *gone : {"RegTestRemB", "RegTestRemOldB", "RegTestRemOldB2"})
        EXPECT_EQ(l.list->Find(OvID(gone)), nullptr) << gone;
    EXPECT_EQ(l.list->Find(OvID("RegTestRemOldA")), a);
    EXPECT_EQ(l.list->Find(OvID("RegTestRemOldC")), c);
    EXPECT_EQ(l.list->Find(OvID("RegTestRemC")), c);

    // A row that is not in this list is ignored.
    LocalList other;
    const Registry *foreign = other.Add("RegTestRemForeign", {});
    l.list->Remove(foreign);
    EXPECT_EQ(l.list->Size(), 2u);
    EXPECT_EQ(other.list->Find(OvID("RegTestRemForeign")), foreign);

    // A second row with the same ID hides the first until it is removed.
    const Registry *shadow = l.Add("RegTestRemA", {});
    EXPECT_EQ(l.list->Find(OvID("RegTestRemA")), shadow);
    l.list->Remove(shadow);
    EXPECT_EQ(l.list->Find(OvID("RegTestRemA")), a);

    l.list->Remove(a);
    l.list->Remove(c);
    EXPECT_EQ(l.list->Size(), 0u);
    EXPECT_TRUE(l.list->Rows().empty());
}

TEST(RegistryRows, RegistrationOrder) {
    LocalList l;
    std::vector<std::string> expected;
    for (int i = 0; i < 40; ++i) {
        // Names out of alphabetical and hash order.
        const std::string id = "RegTestOrder" + std::to_string((i * 17) % 40);
        l.Add(id.c_str(), {});
        expected.push_back(id);
    }
    EXPECT_EQ(RowIds(*l.list), expected);
}

} // namespace
} // namespace Orvane::regtest
