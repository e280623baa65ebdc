#include "host/core/TagList.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "host/core/Tags.h"

namespace Orvane::tagtest {
namespace {

// Tags of each kind, outside the host's named vocabulary so nothing else reads them.
constexpr Tag IntTag = 0x10000f01, IntTag2 = 0x10000f02, DblTag = 0x20000f01, TextTag = 0x30000f01;
constexpr Tag TextTag2 = 0x30000f02, RepTextTag = 0x38000f01, PtrTag = 0x60000f01, IconTag = 0x68000f01;
constexpr Tag IdTag = 0x80000f01, RepIdTag = 0x88000f01, OtherTag = 0x40000f01; // a nibble with no kind

std::vector<std::string> Texts(const std::vector<const TagItem *> &items) {
    std::vector<std::string> v;
    for (const TagItem *i : items)
        v.push_back(KindOfTag(i->tag) == TagKind::Integer ? std::to_string(i->AsInt()) : i->AsText());
    return v;
}

std::vector<Tag> TagsOf(const TagList &l) {
    std::vector<Tag> tags;
    for (const TagItem &i : l.Items()) tags.push_back(i.tag);
    return tags;
}

TEST(TagKinds, TopNibbleAndBytesGiveTheKindAndDomain) {
    const std::tuple<Tag, TagKind, bool> cases[] = {
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
    for (const auto &[tag, kind, repeats] : cases)
        EXPECT_EQ(std::pair(KindOfTag(tag), TagRepeats(tag)), std::pair(kind, repeats)) << std::hex << tag;
    EXPECT_EQ(std::pair(TagDomain(0x12ab3456), TagDomain(0xffffffff)), std::pair(0xabu, 0xffu));
}

TEST(TagItemConvert, NumbersTakeTheTagsKindAndTextIdsAndPointersAreStored) {
    // An integer given to a double tag becomes the double.
    EXPECT_EQ(std::vector({TagItem(DblTag, 3).AsDouble(), TagItem(DblTag, 4000000000u).AsDouble(),
                           TagItem(DblTag, true).AsDouble(), TagItem(DblTag, 0.1f).AsDouble()}),
              std::vector({3.0, 4000000000.0, 1.0, static_cast<double>(0.1f)}));
    EXPECT_EQ(TagItem(DblTag, -3.75).AsInt(), -3) << "a double tag read as an integer truncates";
    // A double given to an integer (or kindless) tag truncates toward zero.
    for (const auto &[in, out] :
         {std::pair{2.9, 2LL}, {-2.9, -2LL}, {0.999, 0LL}, {-0.5, 0LL}, {1e12 + 0.75, 1000000000000LL}}) {
        EXPECT_EQ(TagItem(IntTag, in).AsInt(), out) << in;
        EXPECT_EQ(TagItem(IntTag, in).AsDouble(), static_cast<double>(out)) << in;
        EXPECT_EQ(TagItem(OtherTag, in).AsInt(), out) << in;
    }
    EXPECT_EQ(std::tuple(TagItem(IntTag, 4294967295u).AsInt(), TagItem(IntTag, 9000000000000LL).AsInt(),
                         TagItem(IntTag, -5).AsInt()),
              std::tuple(4294967295LL, 9000000000000LL, -5LL));
    char buffer[] = "borrowed";
    EXPECT_EQ(TagItem(TextTag, buffer).AsText(), buffer); // borrowed, not copied
    EXPECT_EQ(TagItem(IconTag, buffer).AsText(), buffer);
    // Text given to an ID tag is interned; an OvID given to a text tag gives its text.
    std::string name = "TagTestSomeId";
    const TagItem id(IdTag, name.c_str());
    EXPECT_EQ(id.AsID().Text(), OvID("TagTestSomeId").Text());
    EXPECT_EQ(TagItem(RepIdTag, OvID("TagTestOther")).AsID(), OvID("TagTestOther"));
    EXPECT_STREQ(TagItem(TextTag, OvID("TagTestOther")).AsText(), "TagTestOther");
    // Empty or missing text names the null ID, whichever way the ID arrives.
    for (const TagItem &null :
         {TagItem(IdTag, ""), TagItem(IdTag, static_cast<const char *>(nullptr)), TagItem(IdTag, OvID())})
        EXPECT_TRUE(null.AsID().IsNull() && null.value == 0u);
    int target = 0; // a literal 0 is the null pointer
    EXPECT_TRUE(TagItem(PtrTag, &target).AsPtr() == &target && TagItem(OtherTag, &target).AsPtr() == &target);
    EXPECT_EQ(TagItem(PtrTag, 0).AsPtr(), nullptr);
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

TEST(TagList, GettersReadTheFirstEntryOrTheDefaultMergeSetsEveryPairAndRemoveTakesEveryEntry) {
    int target = 0;
    TagList l{{IntTag, 7}, {DblTag, 2.75}, {TextTag, "abc"}, {IdTag, OvID("TagTestGetter")}, {PtrTag, &target}};
    l.Add({IntTag, 99}); // a second entry of a non-repeating tag is shadowed
    EXPECT_EQ(std::tuple(l.GetLong(IntTag), l.GetLong(DblTag), l.GetDouble(DblTag), l.GetDouble(IntTag)),
              std::tuple(7, 2, 2.75, 7.0)); // a double read as an integer truncates
    EXPECT_EQ(std::tuple(std::string(l.GetText(TextTag)), l.GetID(IdTag), l.GetPtr(PtrTag)),
              std::tuple("abc", OvID("TagTestGetter"), &target));
    // Missing tags give the defaults; present zeroes are not the default.
    EXPECT_EQ(std::tuple(l.GetLong(IntTag2, -4), l.GetDouble(IntTag2, 0.5), l.GetBool(IntTag2, true)),
              std::tuple(-4, 0.5, true));
    EXPECT_STREQ(l.GetText(TextTag2, "fallback"), "fallback");
    EXPECT_EQ(l.GetID(RepIdTag, OvID("TagTestDefault")), OvID("TagTestDefault"));
    EXPECT_TRUE(l.GetPtr(0x60000f02, &target) == &target && l.GetPtr(0x60000f02) == nullptr);
    const TagList zeroes{{IntTag, 0}, {DblTag, 0.0}};
    EXPECT_FALSE(zeroes.GetBool(IntTag, true) || zeroes.GetBool(DblTag, true));
    // Merge sets every pair of the other list: in place, appended when absent, repeated tags adding up.
    TagList base{{IntTag, 1}, {TextTag, "keep"}, {RepTextTag, "x"}, {DblTag, 1.5}};
    const TagList other{{DblTag, 4.0},
                        {IntTag2, 5},
                        {RepTextTag, "x"},
                        {RepTextTag, "z"},
                        {IntTag, 3},
                        {IconTag, "i"},
                        {RepIdTag, OvID("TagTestR")},
                        {IconTag, "i"}};
    base.Merge(other);
    EXPECT_EQ(TagsOf(base), (std::vector<Tag>{IntTag, TextTag, RepTextTag, DblTag, IntTag2, RepTextTag, RepTextTag,
                                              IconTag, RepIdTag, IconTag}));
    EXPECT_EQ(std::tuple(base.GetLong(IntTag), base.GetDouble(DblTag), std::string(base.GetText(TextTag))),
              std::tuple(3, 4.0, "keep"));
    EXPECT_EQ(Texts(base.FindAll(RepTextTag)), (std::vector<std::string>{"x", "x", "z"}));
    EXPECT_EQ(Texts(base.FindAll(RepIdTag)), std::vector<std::string>{"TagTestR"});
    EXPECT_EQ(other.Size(), 8u); // the source is left as it was
    // With two entries of one tag (added with Add), Set replaces only the first.
    base.Add({IntTag, 20});
    base.Set({IntTag, 30});
    EXPECT_EQ(Texts(base.FindAll(IntTag)), (std::vector<std::string>{"30", "20"}));
    EXPECT_TRUE(base.Remove(IntTag) && base.Remove(RepTextTag) && !base.Remove(RepTextTag));
    EXPECT_EQ(TagsOf(base), (std::vector<Tag>{TextTag, DblTag, IntTag2, IconTag, RepIdTag, IconTag}));
}

TEST(TagListCopies, ZeroEndedPairsAreCopiedAndPersistedTextOutlivesItsSource) {
    static const char label[] = "label";
    double quarter = 0.25;
    uint64_t quarterBits;
    std::memcpy(&quarterBits, &quarter, sizeof quarterBits);
    uint64_t pairs[] = {IntTag,     static_cast<uint64_t>(-12LL),
                        DblTag,     quarterBits,
                        TextTag,    reinterpret_cast<uint64_t>(label),
                        RepTextTag, reinterpret_cast<uint64_t>("r1"),
                        RepTextTag, reinterpret_cast<uint64_t>("r2"),
                        0,          0,
                        IntTag2,    5}; // after the end: not read
    const TagList l(pairs);
    pairs[1] = 77; // the list holds its own copy of the pairs
    ASSERT_EQ(l.Size(), 5u);
    EXPECT_EQ(std::tuple(l.GetLong(IntTag), l.GetDouble(DblTag), l.GetText(TextTag)),
              std::tuple(-12, 0.25, label)); // text borrowed without copyText
    EXPECT_EQ(Texts(l.FindAll(RepTextTag)), (std::vector<std::string>{"r1", "r2"}));
    EXPECT_TRUE(TagList(static_cast<const uint64_t *>(nullptr)).Empty());
    // With copyText, the text is the list's own.
    char buffer[] = "temporary";
    const uint64_t withText[] = {TextTag, reinterpret_cast<uint64_t>(buffer), 0};
    const TagList copied(withText, true);
    std::memset(buffer, 'X', sizeof buffer - 1);
    EXPECT_STREQ(copied.GetText(TextTag), "temporary");
    char text[] = "first", icon[] = "icon", rep1[] = "rep-one", rep2[] = "rep-two";
    int target = 0;
    std::string idText = "TagTestPersistId";
    const TagList borrowed{
        {TextTag, text},         {IconTag, icon},   {RepTextTag, rep1}, {RepTextTag, rep2},
        {IdTag, idText.c_str()}, {PtrTag, &target}, {IntTag, 8},        {TextTag2, static_cast<const char *>(nullptr)}};
    auto original = std::make_unique<TagList>(borrowed);
    original->Persist();
    const char *owned = original->GetText(TextTag);
    original->Persist(); // a second Persist keeps the storage it already owns
    EXPECT_EQ(original->GetText(TextTag), owned);
    TagList copy(*original), assigned, merged{{IntTag2, 1}};
    assigned = *original;
    merged.Merge(*original);
    for (char *s : {text, icon, rep1, rep2}) std::memset(s, '#', std::strlen(s));
    idText.assign(40, '#');
    original.reset(); // storage now held by the copies alone
    for (TagList *l : {&copy, &assigned, &merged}) {
        EXPECT_EQ(Texts(l->FindAll(RepTextTag)), (std::vector<std::string>{"rep-one", "rep-two"}));
        EXPECT_EQ(std::tuple(std::string(l->GetText(TextTag)), std::string(l->GetText(IconTag)), l->GetID(IdTag)),
                  std::tuple("first", "icon", OvID("TagTestPersistId")));
        EXPECT_EQ(std::tuple(l->GetPtr(PtrTag), l->GetLong(IntTag), l->GetText(TextTag2, "default")),
                  std::tuple(&target, 8, nullptr)); // pointers are not text
    }
    // A copy that Persists again does not copy what it already shares.
    copy.Persist();
    EXPECT_EQ(copy.GetText(TextTag), assigned.GetText(TextTag));
    EXPECT_EQ(merged.GetLong(IntTag2), 1);
}

} // namespace
} // namespace Orvane::tagtest
