// The table of planned classes is consistent: unique IDs, old IDs shadowing nothing, bases that resolve,
// extensions claimed once, places and attributes only on the kinds they mean something for.
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

/// The parts of a '|' separated list.
std::vector<std::string> Split(const char *list) {
    std::vector<std::string> parts(list ? 1 : 0);
    for (const char *p = list; p && *p; ++p)
        if (*p == '|')
            parts.emplace_back();
        else
            parts.back() += *p;
    return parts;
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
        ASSERT_TRUE(row.id && *row.id);
        EXPECT_TRUE(ids.insert(row.id).second) << "duplicate class ID " << row.id;
    }
    for (const ClassDesc &row : PlannedClasses())
        for (const std::string &old : Split(row.oldIds)) {
            EXPECT_FALSE(old.empty()) << row.id;
            EXPECT_EQ(ids.count(old), 0u) << old << " is both an old and a current ID";
            EXPECT_TRUE(oldIds.insert(old).second) << "old ID " << old << " maps to two classes";
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
        EXPECT_TRUE(row.kind != 0 || !row.creatable) << row.id;
        if (row.creatable) continue;
        // Abstract bases have kind 0; the one bare marker is only hidden.
        const bool marker = row.kind == 1 && !row.base && !row.classWord && !row.path && row.attrs.Size() == 1 &&
                            row.attrs.Has(RegHidden);
        EXPECT_TRUE(row.kind == 0 || marker) << row.id;
    }
}

TEST(ClassTable, AttributesPlacesAndTypesSitWhereTheirKindsMeanSomething) {
    Names noEffectMask, noObject, noBlend, noMotionBlur;
    for (const ClassDesc &row : PlannedClasses())
        for (auto [tag, names] : {std::pair{RegNoEffectMask, &noEffectMask},
                                  {RegNoObjectMaterialControls, &noObject},
                                  {RegNoBlendControls, &noBlend},
                                  {RegNoMotionBlurControls, &noMotionBlur}})
            if (row.attrs.Has(tag)) names->insert(row.id);
    // No object controls: every no-effect-mask row, every shape tool, and two more.
    Names expectedNoObject = noEffectMask;
    expectedNoObject.insert({"KeyStretcher", "RunCommand"});
    Names extensions;
    for (const ClassDesc &row : PlannedClasses()) {
        SCOPED_TRACE(row.id);
        if (IsShapeFamily(row.kind) && OffersTool(row.kind)) {
            expectedNoObject.insert(row.id);
            EXPECT_EQ(noBlend.count(row.id), std::strcmp(row.id, "sRender") != 0 ? 1u : 0u);
            EXPECT_STREQ(row.category, "Shape"); // shape tools sit in their own category
            EXPECT_EQ(std::string(row.path), std::string("Tools/Shape/") + row.id);
        }
        // Motion blur is switched off only on tools (and the tracker modifier); masks place things in time and keep it.
        EXPECT_TRUE(!noMotionBlur.count(row.id) ||
                    ((OffersTool(row.kind) || std::string(row.id) == "TrackerModifier") && !(row.kind & RegKindMask)));
        // Regions, domains and device images only for tools that make images.
        for (Tag tag : {RegSupportsRoI, RegSupportsDoD, RegSupportsGPUImages})
            EXPECT_TRUE(!row.attrs.Has(tag) || IsImageTool(row)) << std::hex << tag;
        if (row.kind == 1572864) {
            EXPECT_STREQ(row.base, "ImageFormat");
            const auto claimed = row.attrs.FindAll(RegFormatExtension);
            EXPECT_FALSE(claimed.empty());
            for (const TagItem *item : claimed)
                EXPECT_TRUE(extensions.insert(item->AsText()).second) << "extension claimed twice";
        }
        // Formats and transitions are classes, never offered as tools.
        EXPECT_TRUE((row.kind != 1572864 && row.kind != 983040) ||
                    (row.path == nullptr && row.category == nullptr && row.creatable));
        // A mask yields a mask; a modifier either names the one data type it takes (Publish, Perturb) or yields one
        // of these.
        EXPECT_STREQ(row.kind & RegKindMask ? row.attrs.GetText(RegOutputType) : "Mask", "Mask");
        if (row.kind != 5) continue;
        EXPECT_NE(row.attrs.Has(RegInputType), row.attrs.Has(RegOutputType));
        EXPECT_TRUE(!row.attrs.Has(RegOutputType) ||
                    Names({"Mask", "Text", "Number", "Gradient", "Point"}).count(row.attrs.GetText(RegOutputType)));
    }
    EXPECT_EQ(noObject, expectedNoObject);
}

} // namespace
} // namespace Orvane
