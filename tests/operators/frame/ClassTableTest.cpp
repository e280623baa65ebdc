// Checks the table of planned class identities against what the registry and
// the tool lists need of it: a complete and consistent set of rows, kinds that
// add up, identities on everything offered as a tool, and attribute lists that
// agree with the rules they come from.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <map>
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
    for (const char *p = list; *p; ++p) {
        if (*p == '|') {
            parts.push_back(current);
            current.clear();
        } else {
            current += *p;
        }
    }
    parts.push_back(current);
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

/// IDs of the rows whose kind satisfies `pred`.
template <class Pred> Names RowsWhere(Pred pred) {
    Names ids;
    for (const ClassDesc &row : PlannedClasses())
        if (pred(row)) ids.insert(row.id);
    return ids;
}

bool IsShapeFamily(uint32_t kind) { return (kind & 0xffff0000u) == 0x00560000u; }
bool OffersTool(uint32_t kind) { return (kind & 2u) != 0; }
/// Tools that make or pass images: every tool but the vector shape tools,
/// of which only the rasteriser returns an image.
bool IsImageTool(const ClassDesc &row) {
    return OffersTool(row.kind) && (!IsShapeFamily(row.kind) || std::strcmp(row.id, "sRender") == 0);
}

Names Without(Names all, const Names &removed) {
    for (const std::string &id : removed) all.erase(id);
    return all;
}

const Names kShapeRows = {"sBoolean", "sChangeStyle", "sDuplicate", "sExpand", "sGrid",    "sJitter",
                          "sOutline", "sRender",      "sTransform", "sMerge",  "sEllipse", "sNGon",
                          "sBSpline", "sPolygon",     "sRectangle", "sStar"};
const Names kMaskRows = {"BitmapMask", "EllipseMask",   "MultiPolyMask", "BSplineMask",  "PolylineMask",
                         "RangesMask", "RectangleMask", "TeapotMask",    "TriangleMask", "WandMask"};

TEST(ClassTable, RowsAreCompleteAndUnique) {
    const auto &rows = PlannedClasses();
    // 201 classes less those built beside their code.
    EXPECT_EQ(rows.size(), 187u);
    EXPECT_EQ(FindRow("BrightnessContrast"), nullptr);
    EXPECT_EQ(FindRow("Background"), nullptr);

    Names ids;
    for (const ClassDesc &row : rows) {
        ASSERT_FALSE(Empty(row.id));
        EXPECT_TRUE(ids.insert(row.id).second) << "duplicate class ID " << row.id;
    }
    // Old IDs must not shadow a live class or each other.
    Names oldIds;
    for (const ClassDesc &row : rows)
        for (const std::string &old : Split(row.oldIds)) {
            EXPECT_FALSE(old.empty()) << row.id;
            EXPECT_EQ(ids.count(old), 0u) << old << " is both an old and a current ID";
            EXPECT_TRUE(oldIds.insert(old).second) << "old ID " << old << " maps to two classes";
        }
    // Host constants keep their texts; saved documents hold these spellings.
    for (const char *id : {"EllipseMask", "BSplineMask", "PolylineMask", "MultiPolyMask", "BitmapMask", "RectangleMask",
                           "TriangleMask", "WandMask", "UltraKeyer", "CleanPLate", "Primatte4"})
        EXPECT_NE(FindRow(id), nullptr) << id;
}

TEST(ClassTable, KindCounts) {
    std::map<uint32_t, int> counts;
    for (const ClassDesc &row : PlannedClasses()) ++counts[row.kind];
    const std::map<uint32_t, int> expected = {
        {3, 86},               // tools, less those built
        {131, 3},     {11, 6}, // sources, less Background
        {19, 5},      {35, 10},    {5, 32},      {1, 2},       {0, 2},       {5636099, 9}, {5636355, 1},
        {5636107, 6}, {983040, 8}, {1507328, 7}, {1572864, 7}, {1769472, 1}, {1024, 2},
    };
    EXPECT_EQ(counts, expected);
}

TEST(ClassTable, ToolsCarryAFullIdentity) {
    // The masks the design leaves without an abbreviation.
    const Names noAbbreviation = {"TriangleMask", "TeapotMask"};
    for (const ClassDesc &row : PlannedClasses()) {
        switch (row.kind) {
        case 3:
        case 11:
        case 19:
        case 35:
        case 131:
        case 259: break;
        default: continue;
        }
        SCOPED_TRACE(row.id);
        EXPECT_FALSE(Empty(row.path));
        EXPECT_EQ(std::string(row.path).rfind("Tools/", 0), 0u);
        EXPECT_FALSE(Empty(row.name));
        EXPECT_FALSE(Empty(row.category));
        EXPECT_FALSE(Empty(row.help));
        EXPECT_FALSE(Empty(row.classWord));
        if (noAbbreviation.count(row.id))
            EXPECT_TRUE(Empty(row.abbreviation));
        else {
            ASSERT_FALSE(Empty(row.abbreviation));
            EXPECT_LE(std::strlen(row.abbreviation), 4u);
        }
    }
    // Shape tools: category "Shape", path under Tools/Shape.
    for (const std::string &id : kShapeRows) {
        const ClassDesc *row = FindRow(id);
        ASSERT_NE(row, nullptr) << id;
        EXPECT_STREQ(row->category, "Shape");
        EXPECT_EQ(std::string(row->path), "Tools/Shape/" + id);
    }
}

TEST(ClassTable, FormatsAndTransitionsAreNotOfferedAsTools) {
    int formats = 0, transitions = 0;
    for (const ClassDesc &row : PlannedClasses()) {
        if (row.kind != 1572864 && row.kind != 983040) continue;
        (row.kind == 1572864 ? formats : transitions)++;
        EXPECT_EQ(row.path, nullptr) << row.id;
        EXPECT_EQ(row.category, nullptr) << row.id;
        EXPECT_TRUE(row.creatable) << row.id;
    }
    EXPECT_EQ(formats, 7);
    EXPECT_EQ(transitions, 8);

    const ClassDesc *wipe = FindRow("ZQTWipe");
    ASSERT_NE(wipe, nullptr);
    EXPECT_STREQ(wipe->name, "SMPTE Wipe");
    EXPECT_STREQ(wipe->base, "ZQImageTransition");
    EXPECT_STREQ(wipe->help, "Soft-edged animated wipe based on SMPTE Code");
}

TEST(ClassTable, TellingRowsAndSpellings) {
    const ClassDesc *booleans = FindRow("ChannelBoolean");
    ASSERT_NE(booleans, nullptr);
    EXPECT_EQ(booleans->kind, 131u);
    EXPECT_STREQ(booleans->path, "Tools/Composite/ChannelBoolean");
    EXPECT_STREQ(booleans->abbreviation, "Bol");
    EXPECT_EQ(Split(booleans->aliases), std::vector<std::string>{"shuffle"});

    const ClassDesc *saver = FindRow("Saver");
    ASSERT_NE(saver, nullptr);
    const auto saverAliases = Split(saver->aliases);
    EXPECT_EQ(Names(saverAliases.begin(), saverAliases.end()), Names({"Write", "Export", "Media"}));

    const ClassDesc *ellipse = FindRow("EllipseMask");
    ASSERT_NE(ellipse, nullptr);
    EXPECT_STREQ(ellipse->path, "Tools/Masks/Ellipse");
    EXPECT_STREQ(ellipse->base, "MaskOperator");

    const ClassDesc *xyPath = FindRow("XYPath");
    ASSERT_NE(xyPath, nullptr);
    EXPECT_EQ(xyPath->kind, 5u);
    EXPECT_STREQ(xyPath->path, "Tools/Modifiers/XYPath");
    EXPECT_STREQ(xyPath->name, "XY Path");
    EXPECT_EQ(xyPath->category, nullptr);
    EXPECT_EQ(xyPath->abbreviation, nullptr);
    EXPECT_EQ(xyPath->help, nullptr);

    EXPECT_STREQ(FindRow("ChangeDepth")->help, "Changed the processing color precision");
    EXPECT_STREQ(FindRow("CleanPLate")->classWord, "CleanPlate");
}

TEST(ClassTable, OldIdsAndAliasesReachTheirClasses) {
    std::map<std::string, std::string> byOldId, byAlias;
    for (const ClassDesc &row : PlannedClasses()) {
        for (const std::string &old : Split(row.oldIds)) byOldId[old] = row.id;
        for (const std::string &alias : Split(row.aliases)) byAlias[alias] = row.id;
    }
    EXPECT_EQ(byOldId["SetBgColor"], "SetCanvasColor");
    for (const char *kind : {"Gradient", "Mesh", "Number", "Point", "PolyLine"}) {
        EXPECT_EQ(byOldId[std::string("Peturb") + kind], std::string("Perturb") + kind);
        EXPECT_EQ(FindRow(std::string("Peturb") + kind), nullptr);
    }
    EXPECT_EQ(byOldId["Brazel.FastNoiseBrazel"], "FastNoise");
    EXPECT_EQ(byOldId["Brazel.RealFastNoiseBrazel"], "FastNoise");
    EXPECT_EQ(byAlias["dither"], "ChangeDepth");
    EXPECT_EQ(byAlias["shuffle"], "ChannelBoolean");
    EXPECT_EQ(byAlias["Read"], "Loader");
    EXPECT_EQ(byAlias["Stabilize"], "Tracker");
    // Every polygon mask is found as "Roto".
    for (const char *id : {"PolylineMask", "BSplineMask", "MultiPolyMask"}) {
        const auto aliases = Split(FindRow(id)->aliases);
        EXPECT_NE(std::find(aliases.begin(), aliases.end(), "Roto"), aliases.end()) << id;
    }
}

TEST(ClassTable, SharedClassWords) {
    std::map<std::string, Names> byWord;
    for (const ClassDesc &row : PlannedClasses())
        if (row.classWord) byWord[row.classWord].insert(row.id);
    const std::map<std::string, size_t> sizes = {{"Publish", 6},        {"Perturb", 5},  {"ZQTDissolve", 5},
                                                 {"MultiplyDivide", 2}, {"PolyMask", 2}, {"PolyPath", 3}};
    for (const auto &[word, size] : sizes) EXPECT_EQ(byWord[word].size(), size) << word;
    EXPECT_EQ(byWord["PolyMask"], Names({"BSplineMask", "PolylineMask"}));
    EXPECT_TRUE(byWord["ZQTDissolve"].count("ZQTErode"));
    EXPECT_TRUE(byWord["PolyPath"].count("Path"));
}

TEST(ClassTable, BasesResolve) {
    const Names hostBases = {"ThreadedOperator", "SourceOperator", "MaskOperator",   "ShapeOperator",    "Parameter",
                             "ImageFormat",      "SubInputs",      "PreviewControl", "ZQImageTransition"};
    std::map<std::string, int> counts;
    for (const ClassDesc &row : PlannedClasses()) {
        if (!row.base) continue;
        ++counts[row.base];
        if (!hostBases.count(row.base)) {
            const ClassDesc *base = FindRow(row.base);
            ASSERT_NE(base, nullptr) << row.id << " names unknown base " << row.base;
            EXPECT_NE(base, &row);
        }
    }
    // Whole-table counts less the built rows.
    const std::map<std::string, int> expected = {
        {"ThreadedOperator", 129},
        {"ShapeOperator", 14},
        {"MaskOperator", 9},
        {"ZQImageTransition", 8},
        {"SourceOperator", 6},
        {"Parameter", 7},
        {"ImageFormat", 7},
        {"SubInputs", 1},
        {"PreviewControl", 1},
        {"sPolygon", 1},
        {"PolylineMask", 1},
        {"PolyMaskInputs", 1},
        {"Saver", 1},
    };
    EXPECT_EQ(counts, expected);
}

TEST(ClassTable, OnlyAbstractRowsLackAConstructor) {
    const Names abstract = {"_TimeSpeed", "_TimeStretcher", "VolumeFogLighting"};
    EXPECT_EQ(RowsWhere([](const ClassDesc &row) { return !row.creatable; }), abstract);
    EXPECT_EQ(RowsWhere([](const ClassDesc &row) { return row.kind == 0; }), Without(abstract, {"VolumeFogLighting"}));

    const ClassDesc *lighting = FindRow("VolumeFogLighting");
    ASSERT_NE(lighting, nullptr);
    EXPECT_EQ(lighting->kind, 1u);
    EXPECT_EQ(lighting->base, nullptr);
    EXPECT_EQ(lighting->classWord, nullptr);
    EXPECT_EQ(lighting->path, nullptr);
    EXPECT_EQ(lighting->name, nullptr);
    ASSERT_EQ(lighting->attrs.Size(), 1u);
    EXPECT_TRUE(lighting->attrs.Has(RegHidden));
}

TEST(ClassTable, CommonControlSwitches) {
    const Names noEffectMask = RowsWith(RegNoEffectMask), noObject = RowsWith(RegNoObjectMaterialControls),
                noBlend = RowsWith(RegNoBlendControls), noMotionBlur = RowsWith(RegNoMotionBlurControls);
    EXPECT_EQ(noEffectMask.size(), 13u);
    EXPECT_EQ(noObject.size(), 31u);
    EXPECT_EQ(noBlend.size(), 30u);
    // 99 in the whole table, the built rows included (Background lacks it).
    EXPECT_EQ(noMotionBlur.size() + 9, 99u);

    // No object controls: every no-effect-mask row, every shape tool, and two more.
    Names expectedNoObject = noEffectMask;
    expectedNoObject.insert({"KeyStretcher", "RunCommand"});
    expectedNoObject.insert(kShapeRows.begin(), kShapeRows.end());
    EXPECT_EQ(noObject, expectedNoObject);
    // No blend: every shape tool but the rasteriser.
    for (const std::string &id : kShapeRows) EXPECT_EQ(noBlend.count(id), id != "sRender" ? 1u : 0u) << id;
    for (const char *id : {"Saver", "PreviewSaver", "MediaOut"}) EXPECT_TRUE(noBlend.count(id)) << id;
    EXPECT_TRUE(noEffectMask.count("LensDistort"));
    EXPECT_FALSE(noBlend.count("LensDistort"));

    // Motion blur: off on every tool row but those placing things in time
    // (masks among them), and on the tracker modifier.
    const Names tools = RowsWhere([](const ClassDesc &row) { return OffersTool(row.kind); });
    for (const std::string &id : noMotionBlur) EXPECT_TRUE(tools.count(id) || id == "TrackerModifier") << id;
    for (const std::string &id : kMaskRows) EXPECT_FALSE(noMotionBlur.count(id)) << id;
    for (const char *id : {"Dissolve", "Transform", "DVE", "Tracker", "FastNoise"})
        EXPECT_FALSE(noMotionBlur.count(id)) << id;
    for (const char *id : {"Glow", "Saver"}) EXPECT_TRUE(noMotionBlur.count(id)) << id;
    EXPECT_TRUE(noMotionBlur.count("TrackerModifier"));
}

TEST(ClassTable, ImageCapabilities) {
    const Names imageTools = RowsWhere(IsImageTool);
    // Whole-table totals, the built rows included.
    EXPECT_EQ(imageTools.size() + 13, 124u);
    const Names roi = RowsWith(RegSupportsRoI), dod = RowsWith(RegSupportsDoD), gpu = RowsWith(RegSupportsGPUImages);
    EXPECT_EQ(roi.size() + 13, 98u);
    EXPECT_EQ(dod.size() + 12, 101u);
    EXPECT_EQ(gpu.size() + 11, 83u);
    for (const Names *set : {&roi, &dod, &gpu})
        for (const std::string &id : *set) EXPECT_TRUE(imageTools.count(id)) << id;
    for (const char *id : {"DepthBlur", "Displace", "Shader", "WandMask", "MediaOut", "Primatte4"})
        EXPECT_FALSE(roi.count(id)) << id;
    EXPECT_TRUE(roi.count("DVE"));
    // Tools that read anywhere in their input, and the generators, do not
    // take a partial domain.
    for (const char *id : {"Dent", "Displace", "Distort", "Drip", "Vortex", "DaySky", "FastNoise", "Mandel", "Plasma"})
        EXPECT_FALSE(dod.count(id)) << id;
}

TEST(ClassTable, ListedAttributes) {
    struct Case {
        Tag tag;
        size_t count;
        std::vector<const char *> in, out;
    };
    const std::vector<Case> cases = {
        {RegProcessesCanvasColor, 14, {"ChannelBoolean", "CleanPLate", "WhiteBalance"}, {"Dissolve"}},
        {RegStereoAware, 5, {"Anaglyph", "OpenEXRFormat"}, {"Loader"}},
        {RegHidden, 2, {"VolumeFogLighting", "TeapotMask"}, {}},
        {RegOptionalClass, 4, {"MediaIn", "Primatte4Data"}, {"MediaOut"}},
        {RegGroupPrimatte, 3, {"Primatte4", "Primatte4Control", "Primatte4Data"}, {}},
        {RegGroupMedia, 2, {"MediaIn", "MediaOut"}, {}},
        {RegHasOperatorControl, 13, {"DVE", "MIDI", "XYPath"}, {"Dissolve"}},
        {RegNoAutoProxy, 6, {"CustomFilter"}, {"Dissolve"}},
        {RegNoCache, 10, {"HotSpot", "Saver", "sChangeStyle"}, {"Dissolve"}},
        {RegUnpredictable, 11, {"LUTLookup", "Grain", "TrackerModifier"}, {"Dissolve"}},
        {RegSwitchClass, 1, {"KeyStretcher"}, {}},
        {RegSwitchDataKind, 0, {}, {"KeyStretcher"}},
        {RegKeepsTimeState, 8, {"Calculation", "TessaneParameter", "VolumeFog"}, {"Dissolve"}},
        {RegPreviewTerminal, 2, {"PreviewCleaner", "PreviewSaver"}, {}},
        {RegClipSourceTool, 2, {"Loader", "MediaIn"}, {}},
        {RegMaskMultiPart, 1, {"MultiPolyMask"}, {}},
        {RegOwnCacheValidity, 3, {"ColorCorrector", "Tracker", "Trails"}, {}},
        {RegMaskHasPolygon, 5, {"PolylineMask", "TeapotMask", "RectangleMask"}, {"EllipseMask"}},
        {RegMaskHasSize, 2, {"EllipseMask", "RectangleMask"}, {}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << std::hex << c.tag);
        const Names rows = RowsWith(c.tag);
        EXPECT_EQ(rows.size(), c.count);
        for (const char *id : c.in) EXPECT_TRUE(rows.count(id)) << id;
        for (const char *id : c.out) EXPECT_FALSE(rows.count(id)) << id;
    }

    // Source frame controls: the generators with a source frame; a value of
    // 0 switches one control off on exactly one row.
    const Names sources = {"DaySky", "FastNoise", "Mandel", "Plasma", "MediaIn", "sRender"};
    int switchedOff = 0;
    for (Tag tag : {RegSourceRangeControls, RegSourceSizeControls, RegSourceAspectControls, RegSourceDepthControls}) {
        EXPECT_EQ(RowsWith(tag), sources);
        for (const std::string &id : sources)
            if (FindRow(id)->attrs.GetLong(tag) == 0) ++switchedOff;
    }
    EXPECT_EQ(switchedOff, 1);

    // Transitions in their offered order; the sort order never appears on a
    // row of another kind except RawFormat (and Merge, built beside its code).
    const std::map<std::string, long long> order = {{"ZQTRandomNoise", 6}, {"ZQTRandom", 7},    {"ZQTErode", 8},
                                                    {"ZQTAddDissolve", 9}, {"ZQTDissolve", 10}, {"RawFormat", 1000000}};
    Names sorted;
    for (const auto &[id, value] : order) {
        sorted.insert(id);
        EXPECT_EQ(FindRow(id)->attrs.GetLong(RegSortOrder), value) << id;
    }
    EXPECT_EQ(RowsWith(RegSortOrder), sorted);

    const Names shapeGenerators = {"sEllipse", "sNGon", "sBSpline", "sPolygon", "sRectangle", "sStar", "sChangeStyle"};
    for (Tag tag : {RegShapeGenFilled, RegShapeGenOutline, RegShapeGenTransform, RegShapeGenStyle})
        EXPECT_EQ(RowsWith(tag), shapeGenerators);
}

TEST(ClassTable, ImageFormats) {
    struct Format {
        const char *id, *name;
        std::vector<std::string> extensions;
        std::vector<Tag> caps;
    };
    const std::vector<Format> formats = {
        {"JpegFormat", "JPEG Files", {".jpg", ".jpeg"}, {RegFormatLosslessOnly}},
        {"IPLFormat", "IPL Files", {".ipl"}, {RegFormatOneChannel, RegFormatLosslessOnly}},
        {"BMPFormat", "Windows Bitmap Files", {".BMP", ".DIB"}, {RegFormatKeepsAspect}},
        {"RawFormat", "Orvane Raw Image Files", {".raw"}, {RegFormatKeepsAspect, RegFormatHasDomain}},
        {"PNGFormat", "PNG Files", {".png"}, {}},
        {"TargaFormat", "Targa Files", {".tga"}, {RegFormatLosslessOnly, RegFormatKeepsAspect}},
        {"OpenEXRFormat",
         "OpenEXR Files",
         {".exr", ".sxr"},
         {RegFormatHeaderOnly, RegFormatMultiPart, RegFormatKeepsAspect, RegFormatHasDomain}},
    };
    const std::vector<Tag> allCaps = {RegFormatHeaderOnly,  RegFormatMultiPart, RegFormatOneChannel,
                                      RegFormatKeepsAspect, RegFormatHasDomain, RegFormatLosslessOnly};
    Names seenExtensions;
    for (const Format &f : formats) {
        SCOPED_TRACE(f.id);
        const ClassDesc *row = FindRow(f.id);
        ASSERT_NE(row, nullptr);
        EXPECT_EQ(row->kind, 1572864u);
        EXPECT_STREQ(row->base, "ImageFormat");
        EXPECT_STREQ(row->attrs.GetText(RegFormatName), f.name);
        std::vector<std::string> extensions;
        for (const TagItem *item : row->attrs.FindAll(RegFormatExtension)) {
            extensions.push_back(item->AsText());
            EXPECT_TRUE(seenExtensions.insert(item->AsText()).second) << "extension claimed twice";
        }
        EXPECT_EQ(extensions, f.extensions);
        EXPECT_TRUE(row->attrs.GetBool(RegFormatCanLoad));
        EXPECT_TRUE(row->attrs.GetBool(RegFormatCanSave));
        const bool options = std::strcmp(f.id, "RawFormat") != 0;
        EXPECT_EQ(row->attrs.Has(RegFormatHasOptions), options);
        EXPECT_EQ(row->attrs.Has(RegFormatHasSaveOptions), options);
        for (Tag cap : allCaps) {
            const bool expected = std::find(f.caps.begin(), f.caps.end(), cap) != f.caps.end();
            EXPECT_EQ(row->attrs.Has(cap), expected) << std::hex << cap;
        }
    }
    EXPECT_EQ(RowsWith(RegFormatName).size(), formats.size());
    EXPECT_EQ(seenExtensions.size(), 10u);
}

TEST(ClassTable, DataTypesOfModifiersAndMasks) {
    // Every mask yields a mask; the Publish and Perturb families name the
    // data type they take instead of the one they yield.
    for (const std::string &id : kMaskRows) EXPECT_STREQ(FindRow(id)->attrs.GetText(RegOutputType), "Mask") << id;
    const std::map<std::string, std::string> takes = {
        {"PublishOvID", "ID"},           {"PublishGradient", "Gradient"}, {"PublishNumber", "Number"},
        {"PublishPoint", "Point"},       {"PublishPolyLine", "Polyline"}, {"PublishText", "Text"},
        {"PerturbGradient", "Gradient"}, {"PerturbMesh", "Mesh"},         {"PerturbNumber", "Number"},
        {"PerturbPoint", "Point"},       {"PerturbPolyLine", "Polyline"}};
    for (const auto &[id, type] : takes) {
        const ClassDesc *row = FindRow(id);
        ASSERT_NE(row, nullptr) << id;
        EXPECT_STREQ(row->attrs.GetText(RegInputType), type.c_str()) << id;
        EXPECT_FALSE(row->attrs.Has(RegOutputType)) << id;
    }
    const Names outputs = {"Mask", "Text", "Number", "Gradient", "Point"};
    for (const ClassDesc &row : PlannedClasses()) {
        if (row.kind != 5 || takes.count(row.id)) continue;
        ASSERT_TRUE(row.attrs.Has(RegOutputType)) << row.id;
        EXPECT_TRUE(outputs.count(row.attrs.GetText(RegOutputType))) << row.id;
    }
    EXPECT_STREQ(FindRow("XYPath")->attrs.GetText(RegOutputType), "Point");
    EXPECT_STREQ(FindRow("Calculation")->attrs.GetText(RegOutputType), "Number");
    EXPECT_EQ(RowsWith(RegOutputType2), Names({"sRender"}));
}

} // namespace
} // namespace Orvane
