// The tool library as the host sees it after loading: every row of the class
// table, built or planned, in ClassRegistry.
#include <gtest/gtest.h>

#include <map>
#include <string>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "tests/support/TestSupport.h"

namespace Orvane::librarytest {
namespace {

class LibraryRegistry : public ::testing::Test {
protected:
    void SetUp() override { Orvane::Test::LoadOperators(); }

    /// Rows of the library: everything but what the tests register themselves.
    static std::vector<const Registry *> LibraryRows() {
        std::vector<const Registry *> rows;
        for (const Registry *r : ClassRegistry->Rows())
            if (std::string(r->ID().Text()).rfind("Test", 0) != 0) rows.push_back(r);
        return rows;
    }
};

TEST_F(LibraryRegistry, CountsByKindMatchTheTable) {
    std::map<uint32_t, int> byKind;
    for (const Registry *r : LibraryRows()) ++byKind[r->TypeFlags()];
    const std::map<uint32_t, int> expected = {
        {3, 93},     {131, 4},     {259, 2},     {2307, 1},    {4655363, 1}, {11, 7},      {19, 5},
        {35, 10},    {5, 32},      {1, 2},       {0, 3},       {5636099, 9}, {5636355, 1}, {5636107, 6},
        {983040, 8}, {1507328, 7}, {1572864, 7}, {1769472, 1}, {1024, 2},
    };
    EXPECT_EQ(byKind, expected);
    EXPECT_EQ(LibraryRows().size(), 201u);
}

TEST_F(LibraryRegistry, EveryCreatableRowCarriesTheVocabularyVersionAndHooks) {
    for (const Registry *r : LibraryRows()) {
        SCOPED_TRACE(r->ID().Text());
        if (r->ID() == OvID("VolumeFogLighting")) {
            // A bare marker: its type and the hidden attribute, nothing else.
            EXPECT_EQ(r->TypeFlags(), 1u);
            EXPECT_TRUE(r->Tags().GetBool(RegHidden));
            EXPECT_FALSE(r->CanCreate());
            EXPECT_FALSE(r->Tags().Has(RegApiVersion));
            continue;
        }
        EXPECT_EQ(r->Tags().GetLong(RegApiVersion), RegApiVersionCurrent);
        EXPECT_TRUE(r->Tags().Has(RegInitFunc));
        EXPECT_TRUE(r->Tags().Has(RegScriptInfo));
        EXPECT_EQ(r->CanCreate(), r->TypeFlags() != 0) << "only the abstract bases have no factory";
    }
}

TEST_F(LibraryRegistry, OldClassIdsCreateTheClassThatReplacedThem) {
    const struct {
        const char *old, *now;
    } cases[] = {{"SetBgColor", "SetCanvasColor"},
                 {"PeturbNumber", "PerturbNumber"},
                 {"PeturbPolyLine", "PerturbPolyLine"},
                 {"Brazel.FastNoiseBrazel", "FastNoise"},
                 {"sOffset", "FastNoise"}};
    for (const auto &c : cases) {
        SCOPED_TRACE(c.old);
        const Registry *row = ClassRegistry->Find(OvID(c.old));
        ASSERT_NE(row, nullptr);
        EXPECT_EQ(row->ID(), OvID(c.now));
        OrvaneDoc doc;
        Operator *op = doc.AddTool(OvID(c.old));
        ASSERT_NE(op, nullptr);
        EXPECT_EQ(op->ClassID(), OvID(c.now));
    }
}

TEST_F(LibraryRegistry, BasesResolveAndDerive) {
    const Registry *sw = ClassRegistry->Find(OvID("Switch"));
    ASSERT_NE(sw, nullptr);
    EXPECT_TRUE(sw->IsClassType(OvID("SwitchBase")));
    EXPECT_NE(sw->Base(), nullptr);
    const Registry *bc = ClassRegistry->Find(OvID("BrightnessContrast"));
    ASSERT_NE(bc, nullptr);
    EXPECT_TRUE(bc->IsClassType(OvID("ThreadedOperator")));
    EXPECT_FALSE(bc->IsClassType(OvID("SourceOperator")));
    EXPECT_TRUE(bc->IsRegClassType(RegKindOperator | RegKindTool));
    EXPECT_FALSE(bc->IsRegClassType(RegKindSource));
    const Registry *bg = ClassRegistry->Find(OvID("Background"));
    ASSERT_NE(bg, nullptr);
    EXPECT_TRUE(bg->IsRegClassType(RegKindSource));
    EXPECT_EQ(ClassRegistry->Find(OvID("Background"), RegFamilyImageFormat), nullptr);
    EXPECT_NE(ClassRegistry->Find(OvID("PNGFormat"), RegFamilyImageFormat), nullptr);
}

TEST_F(LibraryRegistry, APlannedToolConstructsButEveryRequestFailsWithOneLine) {
    OrvaneDoc doc;
    Operator *blur = doc.AddTool(OvID("Glow"));
    ASSERT_NE(blur, nullptr);
    EXPECT_TRUE(blur->IsPlaceholder());
    EXPECT_EQ(Evaluate(blur->FindMainOutput(), 0.0), nullptr);
    const auto lines = doc.ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].code, ConsoleError);
    EXPECT_EQ(lines[0].text, blur->Name() + ": the Glow tool is not available yet in this version of Orvane");
}

TEST_F(LibraryRegistry, NonToolClassesAreNotAddedToFlows) {
    OrvaneDoc doc;
    EXPECT_EQ(doc.AddTool(OvID("PNGFormat")), nullptr);
    EXPECT_EQ(doc.AddTool(OvID("SwitchBase")), nullptr);
    EXPECT_EQ(doc.AddTool(OvID("VolumeFogLighting")), nullptr);
    EXPECT_EQ(doc.AddTool(OvID("NoSuchClass")), nullptr);
}

} // namespace
} // namespace Orvane::librarytest

#include "operators/frame/ClassTable.h"

namespace Orvane::librarytest {
namespace {

/// Every class of the catalogue stands in the registry once, with the
/// identity the catalogue gives it, whether it is built or still planned.
TEST_F(LibraryRegistry, BuiltClassesCarryTheirCatalogueIdentity) {
    for (const ClassDesc &d : PlannedClasses()) {
        SCOPED_TRACE(d.id);
        const Registry *row = ClassRegistry->Find(OvID(d.id));
        if (!d.creatable && !d.classWord) continue; // a bare marker row
        ASSERT_NE(row, nullptr);
        EXPECT_EQ(row->TypeFlags(), d.kind);
        for (auto [tag, text] : {std::pair{RegPath, d.path},
                                 {RegName, d.name},
                                 {RegCategory, d.category},
                                 {RegAbbreviation, d.abbreviation},
                                 {RegHelp, d.help},
                                 {RegIcon, d.icon}}) {
            const char *have = row->Tags().GetText(tag);
            EXPECT_STREQ(have ? have : "", text ? text : "") << std::hex << tag;
        }
        for (const TagItem &item : d.attrs.Items()) {
            if (KindOfTag(item.tag) == TagKind::Text) continue; // repeated names are checked by the table test
            EXPECT_TRUE(row->Tags().Has(item.tag)) << std::hex << item.tag;
            if (KindOfTag(item.tag) == TagKind::Integer) {
                EXPECT_EQ(row->Tags().GetLong(item.tag), item.AsInt());
            }
        }
    }
}

} // namespace
} // namespace Orvane::librarytest
