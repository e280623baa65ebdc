// Checks the table of planned class identities against the rules the
// registry and the tool lists rely on: unique IDs, old IDs that shadow
// nothing, bases that resolve, identities on everything offered as a tool,
// and attributes only where they mean something.
#include <gtest/gtest.h>

#include <cstring>
#include <set>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "operators/frame/ClassTable.h"

namespace Orvane {
namespace {

using Names = std::set<std::string>;

const ClassDesc *FindRow(const std::string &id) {
    for (const ClassDesc &row : PlannedClasses())
        if (id == row.id) return &row;
    return nullptr;
}

std::vector<std::string> Split(const char *list) {
    std::vector<std::string> parts;
    if (!list) return parts;
    std::string current;
    for (const char *p = list;; ++p) {
        if (*p && *p != '|') {
            current += *p;
            continue;
        }
        parts.push_back(current);
        current.clear();
        if (!*p) break;
    }
    return parts;
}

bool Empty(const char *text) { return text == nullptr || *text == '\0'; }

/// IDs of the rows that carry `tag`.
Names RowsWith(Tag tag) {
    Names ids;
    for (const ClassDesc &row : PlannedClasses())
        if (row.attrs.Has(tag)) ids.insert(row.id);
    return ids;
}

bool IsShapeFamily(uint32_t kind) { return (kind & 0xffff0000u) == 0x00560000u; }
bool OffersTool(uint32_t kind) { return (kind & 2u) != 0; }
/// Tools that make or pass images: every tool but the vector shape tools,
/// of which only the rasteriser returns an image.
bool IsImageTool(const ClassDesc &row) {
    return OffersTool(row.kind) && (!IsShapeFamily(row.kind) || std::strcmp(row.id, "sRender") == 0);
}

TEST(ClassTable, IdsAndOldIdsAreUniqueAndBuiltClassesLeaveTheTable) {
    EXPECT_EQ(FindRow("BrightnessContrast"), nullptr);
    EXPECT_EQ(FindRow("Background"), nullptr);
    Names ids, oldIds;
    for (const ClassDesc &row : PlannedClasses()) {
        ASSERT_FALSE(Empty(row.id));
        EXPECT_TRUE(ids.insert(row.id).second) << "duplicate class ID " << row.id;
    }
    for (const ClassDesc &row : PlannedClasses())
        for (const std::string &old : Split(row.oldIds)) {
            EXPECT_FALSE(old.empty()) << row.id;
            EXPECT_EQ(ids.count(old), 0u) << old << " is both an old and a current ID";
            EXPECT_TRUE(oldIds.insert(old).second) << "old ID " << old << " maps to two classes";
        }
}

TEST(ClassTable, ToolsCarryAFullIdentity) {
    const Names noAbbreviation = {"TriangleMask", "TeapotMask"}; // the masks the design leaves without one
    for (const ClassDesc &row : PlannedClasses()) {
        if (!std::set<uint32_t>{3, 11, 19, 35, 131, 259}.count(row.kind)) continue;
        SCOPED_TRACE(row.id);
        EXPECT_EQ(std::string(row.path ? row.path : "").rfind("Tools/", 0), 0u);
        EXPECT_FALSE(Empty(row.name) || Empty(row.category) || Empty(row.help) || Empty(row.classWord));
        if (noAbbreviation.count(row.id))
            EXPECT_TRUE(Empty(row.abbreviation));
        else
            EXPECT_TRUE(!Empty(row.abbreviation) && std::strlen(row.abbreviation) <= 4u);
    }
    for (const ClassDesc &row : PlannedClasses()) {
        if (!IsShapeFamily(row.kind) || !OffersTool(row.kind)) continue;
        EXPECT_STREQ(row.category, "Shape") << row.id;
        EXPECT_EQ(std::string(row.path), std::string("Tools/Shape/") + row.id);
    }
    // Formats and transitions are classes, never offered as tools.
    for (const ClassDesc &row : PlannedClasses())
        if (row.kind == 1572864 || row.kind == 983040) {
            EXPECT_TRUE(row.path == nullptr && row.category == nullptr && row.creatable) << row.id;
        }
}

TEST(ClassTable, BasesResolveAndOnlyAbstractRowsLackAConstructor) {
    const Names hostBases = {"ThreadedOperator", "SourceOperator", "MaskOperator",   "ShapeOperator",    "Parameter",
                             "ImageFormat",      "SubInputs",      "PreviewControl", "ZQImageTransition"};
    for (const ClassDesc &row : PlannedClasses()) {
        if (row.base && !hostBases.count(row.base)) {
            const ClassDesc *base = FindRow(row.base);
            ASSERT_NE(base, nullptr) << row.id << " names unknown base " << row.base;
            EXPECT_NE(base, &row);
        }
        if (row.creatable) continue;
        // Abstract bases have kind 0; the one bare marker is only hidden.
        const bool marker = row.kind == 1 && !row.base && !row.classWord && !row.path && row.attrs.Size() == 1 &&
                            row.attrs.Has(RegHidden);
        EXPECT_TRUE(row.kind == 0 || marker) << row.id;
    }
    for (const ClassDesc &row : PlannedClasses()) EXPECT_TRUE(row.kind != 0 || !row.creatable) << row.id;
}

TEST(ClassTable, CommonControlAndImageAttributesSitWhereTheyMeanSomething) {
    const Names noEffectMask = RowsWith(RegNoEffectMask), noObject = RowsWith(RegNoObjectMaterialControls),
                noBlend = RowsWith(RegNoBlendControls), noMotionBlur = RowsWith(RegNoMotionBlurControls);
    // No object controls: every no-effect-mask row, every shape tool, and two more.
    Names expectedNoObject = noEffectMask;
    expectedNoObject.insert({"KeyStretcher", "RunCommand"});
    for (const ClassDesc &row : PlannedClasses()) {
        if (IsShapeFamily(row.kind) && OffersTool(row.kind)) {
            expectedNoObject.insert(row.id);
            EXPECT_EQ(noBlend.count(row.id), std::strcmp(row.id, "sRender") != 0 ? 1u : 0u) << row.id;
        }
        // Motion blur is switched off only on tools (and the tracker
        // modifier); masks place things in time and keep it.
        if (noMotionBlur.count(row.id)) {
            EXPECT_TRUE(OffersTool(row.kind) || std::string(row.id) == "TrackerModifier") << row.id;
        }
        if (row.kind & RegKindMask) {
            EXPECT_FALSE(noMotionBlur.count(row.id)) << row.id;
        }
        // Regions, domains and device images only for tools that make images.
        for (Tag tag : {RegSupportsRoI, RegSupportsDoD, RegSupportsGPUImages})
            if (row.attrs.Has(tag)) {
                EXPECT_TRUE(IsImageTool(row)) << row.id << std::hex << " " << tag;
            }
    }
    EXPECT_EQ(noObject, expectedNoObject);
    // Tools that read anywhere in their input, and the generators, do not take a partial domain.
    for (const char *id : {"Dent", "Displace", "Distort", "Drip", "Vortex", "DaySky", "FastNoise", "Mandel", "Plasma"})
        EXPECT_FALSE(FindRow(id)->attrs.Has(RegSupportsDoD)) << id;
}

TEST(ClassTable, FormatsAndModifiersNameWhatTheyReadAndMake) {
    Names extensions;
    for (const ClassDesc &row : PlannedClasses()) {
        SCOPED_TRACE(row.id);
        if (row.kind == 1572864) {
            EXPECT_STREQ(row.base, "ImageFormat");
            EXPECT_FALSE(Empty(row.attrs.GetText(RegFormatName)));
            EXPECT_TRUE(row.attrs.GetBool(RegFormatCanLoad) && row.attrs.GetBool(RegFormatCanSave));
            const auto claimed = row.attrs.FindAll(RegFormatExtension);
            EXPECT_FALSE(claimed.empty());
            for (const TagItem *item : claimed)
                EXPECT_TRUE(extensions.insert(item->AsText()).second) << "extension claimed twice";
        }
        // A mask yields a mask; a modifier either names the one data type it
        // takes (Publish, Perturb) or yields one of these.
        if (row.kind & RegKindMask) {
            EXPECT_STREQ(row.attrs.GetText(RegOutputType), "Mask");
        }
        if (row.kind != 5) continue;
        EXPECT_NE(row.attrs.Has(RegInputType), row.attrs.Has(RegOutputType));
        if (row.attrs.Has(RegOutputType)) {
            EXPECT_TRUE(Names({"Mask", "Text", "Number", "Gradient", "Point"}).count(row.attrs.GetText(RegOutputType)));
        }
    }
}

} // namespace
} // namespace Orvane
