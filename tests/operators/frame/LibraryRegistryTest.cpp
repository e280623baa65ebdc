// The tool library as the host sees it after loading: every row of the class table, built or planned.
#include <gtest/gtest.h>

#include <string>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "operators/frame/ClassTable.h"
#include "tests/support/TestSupport.h"

namespace Orvane::librarytest {
namespace {

class LibraryRegistry : public ::testing::Test {
protected:
    void SetUp() override { Orvane::Test::LoadOperators(); }
};

TEST_F(LibraryRegistry, EveryRowCarriesTheVocabularyVersionHooksAndItsTableIdentity) {
    for (const Registry *r : ClassRegistry->Rows()) {
        if (std::string(r->ID().Text()).rfind("Test", 0) == 0) continue; // registered by the tests
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
    // Every planned class stands in the registry with its table identity: kind, texts, aliases and attributes.
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
        std::string aliases;
        for (const TagItem *a : row->Tags().FindAll(RegAlias))
            aliases += (aliases.empty() ? "" : "|") + std::string(a->AsText());
        EXPECT_EQ(aliases.rfind(d.aliases ? d.aliases : "", 0), 0u) << aliases; // a base's may follow
        for (const TagItem &item : d.attrs.Items()) {
            EXPECT_TRUE(row->Tags().Has(item.tag)) << std::hex << item.tag;
            if (KindOfTag(item.tag) == TagKind::Integer) {
                EXPECT_EQ(row->Tags().GetLong(item.tag), item.AsInt());
            }
        }
    }
}

TEST_F(LibraryRegistry, OldIdsCreateTheirReplacementPlannedToolsFailAndNonToolsAreNotAdded) {
    OrvaneDoc doc;
    for (const auto &[old, now] : {std::pair{"SetBgColor", "SetCanvasColor"},
                                   {"PeturbNumber", "PerturbNumber"},
                                   {"PeturbPolyLine", "PerturbPolyLine"},
                                   {"Brazel.FastNoiseBrazel", "FastNoise"},
                                   {"sOffset", "FastNoise"}}) {
        const Registry *row = ClassRegistry->Find(OvID(old));
        Operator *op = doc.AddTool(OvID(old));
        ASSERT_TRUE(row && op) << old;
        EXPECT_EQ(row->ID(), OvID(now)) << old;
        EXPECT_EQ(op->ClassID(), OvID(now)) << old;
    }
    // A planned tool constructs, but every request fails with one line.
    Operator *glow = doc.AddTool(OvID("Glow"));
    ASSERT_TRUE(glow && glow->IsPlaceholder());
    EXPECT_EQ(Evaluate(glow->FindMainOutput(), 0.0), nullptr);
    const auto lines = doc.ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].code, ConsoleError);
    EXPECT_EQ(lines[0].text, glow->Name() + ": the Glow tool is not available yet in this version of Orvane");
    for (const char *id : {"PNGFormat", "SwitchBase", "VolumeFogLighting", "NoSuchClass"})
        EXPECT_EQ(doc.AddTool(OvID(id)), nullptr) << id;
}

} // namespace
} // namespace Orvane::librarytest
