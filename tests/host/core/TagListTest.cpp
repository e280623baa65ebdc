#include "host/core/TagList.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "host/core/Tags.h"

namespace Orvane::tagtest {
namespace {

// Tags of each kind, outside the host's named vocabulary so nothing else reads them.
constexpr Tag IntTag = 0x10000f01, IntTag2 = 0x10000f02;
constexpr Tag DblTag = 0x20000f01;
constexpr Tag TextTag = 0x30000f01, TextTag2 = 0x30000f02;
constexpr Tag RepTextTag = 0x38000f01;
constexpr Tag PtrTag = 0x60000f01;
constexpr Tag IconTag = 0x68000f01;
constexpr Tag IdTag = 0x80000f01;
constexpr Tag RepIdTag = 0x88000f01;
constexpr Tag OtherTag = 0x40000f01; // a nibble with no kind

uint64_t DoubleBits(double d) {
    uint64_t b;
    std::memcpy(&b, &d, sizeof b);
    return b;
}

std::vector<long long> Longs(const std::vector<const TagItem *> &items) {
    std::vector<long long> v;
    for (const TagItem *i : items) v.push_back(i->AsInt());
    return v;
}

std::vector<std::string> Texts(const std::vector<const TagItem *> &items) {
    std::vector<std::string> v;
    for (const TagItem *i : items) v.push_back(i->AsText() ? i->AsText() : "<null>");
    return v;
}

int Triple(int v) { return 3 * v; }

// ---------------------------------------------------------------------------------------------------------------
// Tag numbers

TEST(TagKinds, TopNibbleAndByteGiveTheKind) {
    struct Case {
        Tag tag;
        TagKind kind;
        bool repeats;
    };
    const Case cases[] = {
        {0x10000000, TagKind::Integer, false}, {0x1fffffff, TagKind::Integer, false},
        {0x20030004, TagKind::Double, false},  {0x30000002, TagKind::Text, false},
        {0x38000000, TagKind::Text, true},     {0x38040000, TagKind::Text, true},
        {0x60000000, TagKind::Pointer, false}, {0x68050001, TagKind::Text, true},
        {0x80000001, TagKind::ID, false},      {0x88000000, TagKind::ID, true},
        {0x88020000, TagKind::ID, true},       {0x00000000, TagKind::Unknown, false},
        {0x40000000, TagKind::Unknown, false}, {0x50000000, TagKind::Unknown, false},
        {0x70000000, TagKind::Unknown, false}, {0x90000000, TagKind::Unknown, false},
        {0xf0000000, TagKind::Unknown, false}, {0x31000000, TagKind::Text, false},
        {0x81000000, TagKind::ID, false},      {0x69000000, TagKind::Pointer, false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << std::hex << "tag 0x" << c.tag);
        EXPECT_EQ(KindOfTag(c.tag), c.kind);
        EXPECT_EQ(TagRepeats(c.tag), c.repeats);
    }
}

TEST(TagKinds, SecondByteIsTheDomain) {
    struct Case {
        Tag tag;
        unsigned domain;
    };
    const Case cases[] = {{LinkMain, 0x02},       {LinkDataType, 0x02}, {InputDefault, 0x03}, {InputControl, 0x03},
                          {ControlLabel, 0x04},   {ListAddItem, 0x04},  {ButtonIconOn, 0x05}, {SliderLowLabel, 0x05},
                          {RegConstructor, 0x00}, {0x12ab3456, 0xab},   {0xffffffff, 0xff}};
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << std::hex << "tag 0x" << c.tag);
        EXPECT_EQ(TagDomain(c.tag), c.domain);
    }
}

// ---------------------------------------------------------------------------------------------------------------
// TagItem conversions

TEST(TagItemConvert, NumbersTakeTheTagsKind) {
    // An integer given to a double tag becomes the double.
    EXPECT_EQ(TagItem(DblTag, 3).value, DoubleBits(3.0));
    EXPECT_EQ(TagItem(DblTag, -7LL).AsDouble(), -7.0);
    EXPECT_EQ(TagItem(DblTag, 4000000000u).AsDouble(), 4000000000.0);
    EXPECT_EQ(TagItem(DblTag, true).AsDouble(), 1.0);
    EXPECT_EQ(TagItem(DblTag, 2.5).value, DoubleBits(2.5));
    EXPECT_EQ(TagItem(DblTag, 0.1f).AsDouble(), static_cast<double>(0.1f));

    // A double given to an integer tag truncates toward zero.
    struct Trunc {
        double in;
        long long out;
    };
    for (const Trunc &t : {Trunc{2.9, 2}, Trunc{-2.9, -2}, Trunc{0.999, 0}, Trunc{-0.5, 0},
                           Trunc{1e12 + 0.75, 1000000000000}, Trunc{7.0, 7}}) {
        SCOPED_TRACE(t.in);
        EXPECT_EQ(TagItem(IntTag, t.in).AsInt(), t.out);
        EXPECT_EQ(TagItem(IntTag, t.in).AsDouble(), static_cast<double>(t.out));
        EXPECT_EQ(TagItem(OtherTag, t.in).AsInt(), t.out); // kindless tags hold integers
    }

    EXPECT_EQ(TagItem(IntTag, -5).AsInt(), -5);
    EXPECT_EQ(TagItem(IntTag, 4294967295u).AsInt(), 4294967295LL);
    EXPECT_EQ(TagItem(IntTag, 9000000000000LL).AsInt(), 9000000000000LL);
    EXPECT_EQ(TagItem(IntTag, true).AsInt(), 1);
    EXPECT_EQ(TagItem(IntTag, false).AsInt(), 0);
    // Read the other way: a double tag read as an integer truncates.
    EXPECT_EQ(TagItem(DblTag, -3.75).AsInt(), -3);
    EXPECT_EQ(TagItem(IntTag, 12).AsDouble(), 12.0);
}

TEST(TagItemConvert, TextIdsAndPointersAreStored) {
    char buffer[] = "borrowed";
    const TagItem text(TextTag, buffer);
    EXPECT_EQ(text.AsText(), buffer); // borrowed, not copied
    EXPECT_EQ(TagItem(TextTag, static_cast<const char *>(nullptr)).AsText(), nullptr);
    EXPECT_EQ(TagItem(IconTag, buffer).AsText(), buffer);

    // Text given to an ID tag is interned.
    std::string name = "TagTestSomeId";
    const TagItem id(IdTag, name.c_str());
    EXPECT_EQ(id.AsID(), OvID("TagTestSomeId"));
    EXPECT_EQ(id.AsID().Text(), OvID("TagTestSomeId").Text());
    EXPECT_NE(id.AsText(), name.c_str());

    // OvIDs to ID and text tags store the interned text; the null ID stays null.
    const OvID other("TagTestOther");
    EXPECT_EQ(TagItem(IdTag, other).AsID(), other);
    EXPECT_EQ(TagItem(RepIdTag, other).AsID(), other);
    EXPECT_STREQ(TagItem(TextTag, other).AsText(), "TagTestOther");
    EXPECT_EQ(TagItem(IdTag, OvID()).value, 0u);
    EXPECT_TRUE(TagItem(IdTag, OvID()).AsID().IsNull());

    // Empty or missing text names the null ID, whichever way the ID arrives.
    for (const char *empty : {"", static_cast<const char *>(nullptr)}) {
        SCOPED_TRACE(empty ? "empty text" : "null text");
        const TagItem item(IdTag, empty);
        EXPECT_EQ(item.AsID(), OvID(empty));
        EXPECT_EQ(item.AsID(), OvID());
        EXPECT_TRUE(item.AsID().IsNull());
    }

    int target = 0;
    EXPECT_EQ(TagItem(PtrTag, &target).AsPtr(), &target);
    EXPECT_EQ(TagItem(PtrTag, nullptr).AsPtr(), nullptr);
    EXPECT_EQ(TagItem(PtrTag, 0).AsPtr(), nullptr); // a literal 0 is the null pointer
    EXPECT_EQ(TagItem(OtherTag, &target).AsPtr(), &target);

    // A function travels as a pointer and comes back callable.
    const TagItem fn(PtrTag, &Triple);
    auto back = reinterpret_cast<int (*)(int)>(fn.AsPtr());
    ASSERT_NE(back, nullptr);
    EXPECT_EQ(back(14), 42);

    const TagItem raw = TagItem::Raw(TextTag, 0x1234);
    EXPECT_EQ(raw.tag, TextTag);
    EXPECT_EQ(raw.value, 0x1234u);
}

TEST(TagItemConvertDeathTest, WrongKindsAbort) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    int target = 0;
    EXPECT_DEATH(TagItem(IntTag, "text"), "tag 0x10000f01 given a text value");
    EXPECT_DEATH(TagItem(DblTag, static_cast<const void *>(&target)), "tag 0x20000f01 given a pointer value");
    EXPECT_DEATH(TagItem(TextTag, 5), "tag 0x30000f01 given a integer value");
    EXPECT_DEATH(TagItem(PtrTag, 1.5), "tag 0x60000f01 given a double value");
    EXPECT_DEATH(TagItem(PtrTag, 3), "tag 0x60000f01 given a integer value");
    EXPECT_DEATH(TagItem(IdTag, static_cast<const void *>(&target)), "tag 0x80000f01 given a pointer value");
    EXPECT_DEATH(TagItem(IntTag, OvID("x")), "tag 0x10000f01 given a ID value");
}

// ---------------------------------------------------------------------------------------------------------------
// Lists

TEST(TagListGet, TypedGettersReadTheFirstEntryOrTheDefault) {
    int target = 0;
    TagList l{{IntTag, 7}, {DblTag, 2.75}, {TextTag, "abc"}, {IdTag, OvID("TagTestGetter")}, {PtrTag, &target}};
    l.Add({IntTag, 99}); // a second entry of a non-repeating tag is shadowed

    EXPECT_EQ(l.Size(), 6u);
    EXPECT_FALSE(l.Empty());
    EXPECT_TRUE(TagList().Empty());
    EXPECT_TRUE(l.Has(IntTag));
    EXPECT_FALSE(l.Has(IntTag2));
    EXPECT_EQ(l.Find(IntTag), &l.Items()[0]);
    EXPECT_EQ(l.Find(IntTag2), nullptr);

    EXPECT_EQ(l.GetLong(IntTag), 7);
    EXPECT_EQ(l.GetLong(IntTag2, -4), -4);
    EXPECT_EQ(l.GetLong(DblTag), 2); // truncated
    EXPECT_EQ(l.GetDouble(DblTag), 2.75);
    EXPECT_EQ(l.GetDouble(IntTag), 7.0);
    EXPECT_EQ(l.GetDouble(IntTag2, 0.5), 0.5);
    EXPECT_TRUE(l.GetBool(IntTag));
    EXPECT_TRUE(l.GetBool(IntTag2, true));
    EXPECT_FALSE(l.GetBool(IntTag2));
    EXPECT_STREQ(l.GetText(TextTag), "abc");
    EXPECT_EQ(l.GetText(TextTag2), nullptr);
    EXPECT_STREQ(l.GetText(TextTag2, "fallback"), "fallback");
    EXPECT_EQ(l.GetID(IdTag), OvID("TagTestGetter"));
    EXPECT_EQ(l.GetID(RepIdTag, OvID("TagTestDefault")), OvID("TagTestDefault"));
    EXPECT_TRUE(l.GetID(RepIdTag).IsNull());
    EXPECT_EQ(l.GetPtr(PtrTag), &target);
    EXPECT_EQ(l.GetPtrAs<int>(PtrTag), &target);
    EXPECT_EQ(l.GetPtr(0x60000f02, &target), &target);
    EXPECT_EQ(l.GetPtr(0x60000f02), nullptr);

    const TagList zeroes{{IntTag, 0}, {DblTag, 0.0}};
    EXPECT_FALSE(zeroes.GetBool(IntTag, true));
    EXPECT_FALSE(zeroes.GetBool(DblTag, true));
}

TEST(TagListSet, ReplacesOrAppends) {
    TagList l{{IntTag, 1}, {TextTag, "one"}, {IntTag2, 2}};
    l.Set({TextTag, "two"}); // replaced in place
    l.Set({DblTag, 0.5});    // absent: appended
    l.Set({IntTag, 10});
    ASSERT_EQ(l.Size(), 4u);
    EXPECT_EQ(l.Items()[0].tag, IntTag);
    EXPECT_EQ(l.Items()[0].AsInt(), 10);
    EXPECT_EQ(l.Items()[1].tag, TextTag);
    EXPECT_STREQ(l.Items()[1].AsText(), "two");
    EXPECT_EQ(l.Items()[2].tag, IntTag2);
    EXPECT_EQ(l.Items()[3].tag, DblTag);

    // With two entries of one tag (added with Add), Set replaces only the first.
    l.Add({IntTag, 20});
    l.Set({IntTag, 30});
    EXPECT_EQ(Longs(l.FindAll(IntTag)), (std::vector<long long>{30, 20}));

    // Repeated tags add up.
    TagList r;
    for (const char *s : {"a", "b", "a", "c"}) r.Set({RepTextTag, s});
    r.Set({RepIdTag, OvID("TagTestR1")});
    r.Set({RepIdTag, OvID("TagTestR2")});
    r.Set({IconTag, "icon1"});
    r.Set({IconTag, "icon2"});
    EXPECT_EQ(Texts(r.FindAll(RepTextTag)), (std::vector<std::string>{"a", "b", "a", "c"}));
    const auto ids = r.FindAll(RepIdTag);
    ASSERT_EQ(ids.size(), 2u);
    EXPECT_EQ(ids[0]->AsID(), OvID("TagTestR1"));
    EXPECT_EQ(ids[1]->AsID(), OvID("TagTestR2"));
    EXPECT_EQ(Texts(r.FindAll(IconTag)), (std::vector<std::string>{"icon1", "icon2"}));
    EXPECT_TRUE(r.FindAll(TextTag).empty());
}

TEST(TagListFindAll, KeepsListOrderAcrossOtherTags) {
    TagList l;
    for (int i = 0; i < 10; ++i) {
        l.Add({IntTag, i});
        if (i % 3 == 0) l.Add({IntTag2, 100 + i});
    }
    EXPECT_EQ(Longs(l.FindAll(IntTag)), (std::vector<long long>{0, 1, 2, 3, 4, 5, 6, 7, 8, 9}));
    EXPECT_EQ(Longs(l.FindAll(IntTag2)), (std::vector<long long>{100, 103, 106, 109}));
    for (const TagItem *item : l.FindAll(IntTag2)) EXPECT_EQ(item->tag, IntTag2);
}

TEST(TagListMerge, SetsEveryPairOfTheOther) {
    TagList base{{IntTag, 1}, {TextTag, "keep"}, {RepTextTag, "x"}, {DblTag, 1.5}};
    const TagList other{{DblTag, 4.0}, {IntTag2, 5}, {RepTextTag, "y"}, {RepTextTag, "z"}, {IntTag, 3}};
    base.Merge(other);
    ASSERT_EQ(base.Size(), 7u);
    EXPECT_EQ(base.GetLong(IntTag), 3);
    EXPECT_EQ(base.GetDouble(DblTag), 4.0);
    EXPECT_STREQ(base.GetText(TextTag), "keep");
    EXPECT_EQ(base.GetLong(IntTag2), 5);
    EXPECT_EQ(Texts(base.FindAll(RepTextTag)), (std::vector<std::string>{"x", "y", "z"}));
    const std::vector<Tag> order = {IntTag, TextTag, RepTextTag, DblTag, IntTag2, RepTextTag, RepTextTag};
    for (size_t i = 0; i < order.size(); ++i) EXPECT_EQ(base.Items()[i].tag, order[i]) << i;
    EXPECT_EQ(other.Size(), 5u); // the source is left as it was

    TagList empty;
    empty.Merge(other);
    EXPECT_EQ(empty.Size(), other.Size());
}

TEST(TagListRemove, TakesOutEveryEntryOfTheTag) {
    TagList l{{IntTag, 1}, {RepTextTag, "a"}, {IntTag2, 2}, {RepTextTag, "b"}};
    l.Add({IntTag, 3});
    EXPECT_TRUE(l.Remove(IntTag));
    EXPECT_FALSE(l.Has(IntTag));
    EXPECT_EQ(l.Size(), 3u);
    EXPECT_TRUE(l.Remove(RepTextTag));
    EXPECT_EQ(l.Size(), 1u);
    EXPECT_EQ(l.GetLong(IntTag2), 2);
    EXPECT_FALSE(l.Remove(RepTextTag));
    EXPECT_FALSE(l.Remove(DblTag));
    EXPECT_EQ(l.Size(), 1u);
}

TEST(TagListArray, ZeroEndedPairsAreCopied) {
    static const char label[] = "label";
    int target = 0;
    uint64_t pairs[] = {IntTag,     static_cast<uint64_t>(-12LL),
                        DblTag,     DoubleBits(0.25),
                        TextTag,    reinterpret_cast<uint64_t>(label),
                        PtrTag,     reinterpret_cast<uint64_t>(&target),
                        RepTextTag, reinterpret_cast<uint64_t>("r1"),
                        RepTextTag, reinterpret_cast<uint64_t>("r2"),
                        0,          0,
                        IntTag2,    5}; // after the end: not read
    const TagList l(pairs);
    pairs[1] = 77; // the list holds its own copy of the pairs
    ASSERT_EQ(l.Size(), 6u);
    EXPECT_EQ(l.GetLong(IntTag), -12);
    EXPECT_EQ(l.GetDouble(DblTag), 0.25);
    EXPECT_EQ(l.GetText(TextTag), label); // borrowed without copyText
    EXPECT_EQ(l.GetPtr(PtrTag), &target);
    EXPECT_EQ(Texts(l.FindAll(RepTextTag)), (std::vector<std::string>{"r1", "r2"}));
    EXPECT_FALSE(l.Has(IntTag2));

    EXPECT_TRUE(TagList(static_cast<const uint64_t *>(nullptr)).Empty());
    const uint64_t none[] = {0, 0};
    EXPECT_TRUE(TagList(none).Empty());

    // With copyText, the text is the list's own.
    char buffer[] = "temporary";
    const uint64_t withText[] = {TextTag, reinterpret_cast<uint64_t>(buffer), IntTag, 4, 0};
    const TagList copied(withText, true);
    std::memset(buffer, 'X', sizeof buffer - 1);
    EXPECT_STREQ(copied.GetText(TextTag), "temporary");
    EXPECT_EQ(copied.GetLong(IntTag), 4);
}

// ---------------------------------------------------------------------------------------------------------------
// Persist

TEST(TagListPersist, TextSurvivesTheSourceBuffer) {
    char text[] = "first";
    char icon[] = "icon";
    char rep1[] = "rep-one", rep2[] = "rep-two";
    int target = 0;
    std::string idText = "TagTestPersistId";
    TagList l{
        {TextTag, text},         {IconTag, icon},   {RepTextTag, rep1}, {RepTextTag, rep2},
        {IdTag, idText.c_str()}, {PtrTag, &target}, {IntTag, 8},        {TextTag2, static_cast<const char *>(nullptr)}};
    l.Persist();
    for (char *s : {text, icon, rep1, rep2}) std::memset(s, '#', std::strlen(s));
    idText.assign(40, '#');

    EXPECT_STREQ(l.GetText(TextTag), "first");
    EXPECT_STREQ(l.GetText(IconTag), "icon");
    EXPECT_EQ(Texts(l.FindAll(RepTextTag)), (std::vector<std::string>{"rep-one", "rep-two"}));
    EXPECT_EQ(l.GetID(IdTag), OvID("TagTestPersistId"));
    EXPECT_EQ(l.GetPtr(PtrTag), &target); // pointers are not text
    EXPECT_EQ(l.GetLong(IntTag), 8);
    EXPECT_EQ(l.GetText(TextTag2, "default"), nullptr);

    // A second Persist keeps the storage it already owns.
    const char *owned = l.GetText(TextTag);
    l.Persist();
    EXPECT_EQ(l.GetText(TextTag), owned);
}

TEST(TagListPersist, CopiesOutliveTheOriginal) {
    TagList copy, assigned, merged{{IntTag, 1}};
    {
        std::string a = "alpha", b = "beta";
        auto original = std::make_unique<TagList>(TagList{{TextTag, a.c_str()}, {RepTextTag, b.c_str()}});
        original->Persist();
        copy = TagList(*original);
        assigned = *original;
        merged.Merge(*original);
        a.assign(a.size(), '?');
        b.assign(b.size(), '?');
        original.reset(); // storage now held by the copies alone
    }
    for (const TagList *l : {&copy, &assigned, &merged}) {
        EXPECT_STREQ(l->GetText(TextTag), "alpha");
        EXPECT_STREQ(l->GetText(RepTextTag), "beta");
    }
    // A copy that Persists again does not copy what it already shares.
    const char *shared = copy.GetText(TextTag);
    copy.Persist();
    EXPECT_EQ(copy.GetText(TextTag), shared);
    EXPECT_EQ(merged.GetLong(IntTag), 1);
}

} // namespace
} // namespace Orvane::tagtest
