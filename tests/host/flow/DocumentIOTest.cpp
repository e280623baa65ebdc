#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <fstream>
#include <set>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/ScriptVal.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Gradient.h"
#include "host/flow/Request.h"
#include "tests/support/TestSupport.h"

namespace Orvane::documentiotest {
namespace ts = ::Orvane::Test;
namespace {

using Names = std::vector<std::string>;

/// A tool with one input of each kind a document stores, in the order Size, Center, Caption, Mode, Colors, Width,
/// Histo, Choice, Input.
class DocTool : public ThreadedOperator {
public:
    DocTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        const OvID number = CLSID_DataType_Number, a("ModeA"), b("ModeB");
        ts::AddIn(this, "Size", number, {{InputDefault, 1.0}, {InputMinAllowed, 0.0}});
        ts::AddIn(this, "Center", CLSID_DataType_Point, {{InputDefaultX, 0.5}, {InputDefaultY, 0.5}});
        ts::AddIn(this, "Caption", CLSID_DataType_Text);
        ts::AddIn(this, "Mode", CLSID_DataType_OvID,
                  {{InputDefaultId, a},
                   {ListAddItem, "Mode A"},
                   {ListItemId, a},
                   {ListAddItem, "Mode B"},
                   {ListItemId, b},
                   {ListAcceptedId, OvID("ModeOld")}});
        ts::AddIn(this, "Colors", CLSID_DataType_Gradient);
        ts::AddIn(this, "Width", number,
                  {{InputDefault, 100.0}, {InputInteger, 1}, {InputMaxAllowed, 1000.0}, {LinkForceSave, 1}});
        ts::AddIn(this, "Histo", number, {{LinkNotSaved, 1}});
        ts::AddIn(this, "Choice", number,
                  {{ListAddItem, "First"}, {ListAddItem, "Soft Light"}, {ListAddItem, "Third"}});
        ts::AddImageIn(this, {{InputRequired, 0}});
        output = ts::AddImageOut(this);
        AddOutputTagList("Value", "Value", {{LinkDataType, number}});
    }
    void Process(Request *req) override { req->SetOutputData(output, req->GetInputData(FindInput("Input"))); }
    Output *output;
};

const char *const DocToolClass = "DocIOTestTool";

OvID DocToolID() {
    return ts::RegisterTool(DocToolClass, &ts::MakeTool<DocTool>,
                            {{RegAbbreviation, "DT"},
                             {RegName, "Doc Test Tool"},
                             {RegAlias, "DocAlias"},
                             {RegNoBlendControls, 1},
                             {RegNoEffectMask, 1}});
}

Operator *AddDocTool(OrvaneDoc &doc, const std::string &name) { return doc.AddTool(DocToolID(), name); }

DocumentLoadResult Load(const std::string &text, OrvaneDoc &doc, bool lenient = false) {
    DocToolID();
    return LoadDocument(text, doc, {.lenient = lenient});
}

/// The table of one tool in saved text, and the keys of its inputs.
ScriptVal ToolIn(const std::string &text, const std::string &tool) {
    const ScriptVal root = ScriptVal::FromText(text), *t = root.Find("Tools")->Find(tool);
    return t ? *t : ScriptVal();
}
Names Keys(const ScriptVal *table) {
    Names keys;
    if (table && table->IsTable())
        for (const auto &[k, v] : table->Entries()) keys.push_back(k.IsText() ? k.AsText() : k.ToText());
    return keys;
}
Names InputKeys(const std::string &text, const std::string &tool) { return Keys(ToolIn(text, tool).Find("Inputs")); }

std::string Joined(const Names &lines) {
    std::string all;
    for (const std::string &l : lines) all += l + "\n";
    return all;
}

/// Saves, loads into a fresh document without a warning, saves again: both texts must match.
void ExpectStableRoundTrip(const OrvaneDoc &doc) {
    const std::string first = SaveDocument(doc);
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(first, *again);
    ASSERT_TRUE(r.ok && r.warnings.empty()) << r.error << Joined(r.warnings) << "\n" << first;
    EXPECT_EQ(SaveDocument(*again), first);
}

Ref<Gradient> TwoStops() {
    return MakeRef<Gradient>(std::vector<GradientStop>{{0.0, 1.f, 0.f, 0.f, 1.f}, {0.5, 0.f, 1.f, 0.f, 0.5f}});
}

TEST(DocumentIO, SaveLoadSaveGivesTheSameBytesAndRestoresWhatWasSaved) {
    ExpectStableRoundTrip(*MakeRef<OrvaneDoc>());
    // Constants of every kind, curves of numbers, points and gradients, links, preferences and ranges.
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Operator *c = AddDocTool(*doc, "Const1"), *a = AddDocTool(*doc, "Anim1");
    ts::SetNumber(c, "Size", 1.0 / 3.0);
    ts::SetPoint(c, "Center", 0.1 + 0.2, -1e-300);
    ASSERT_TRUE(c->FindInput("Caption")->SetValue(MakeRef<Text>("tab\there \"quoted\"\nnext line \\ caf\xc3\xa9")));
    ts::SetID(c, "Mode", "ModeB");
    ts::SetNumber(c, "Choice", 2);
    ASSERT_TRUE(c->FindInput("Colors")->SetValue(TwoStops()));
    ts::SetNumber(AddDocTool(*doc, "Const2"), "Size", 1e21);
    AnimCurve size = ts::NumberCurve({{0, 1.0}}), center, colors;
    size.SetKey(12, MakeRef<Number>(2.25), KeyInterp::Smooth);
    size.SetKey(24, MakeRef<Number>(3.0), KeyInterp::Hold);
    ASSERT_TRUE(a->FindInput("Size")->SetCurve(size));
    center.SetKey(-5, MakeRef<Point>(0.0, 1.0), KeyInterp::Smooth);
    center.SetKey(5, MakeRef<Point>(1.0, 0.0), KeyInterp::Hold);
    ASSERT_TRUE(a->FindInput("Center")->SetCurve(center));
    colors.SetKey(0, TwoStops());
    colors.SetKey(10, MakeRef<Gradient>());
    ASSERT_TRUE(a->FindInput("Colors")->SetCurve(colors));
    Operator *src = AddDocTool(*doc, "Src"), *mid = AddDocTool(*doc, "Blur_2"), *end = AddDocTool(*doc, "after");
    ASSERT_TRUE(mid->FindInput("Input")->ConnectTo(src->FindOutput("Output")));
    ASSERT_TRUE(end->FindInput("Input")->ConnectTo(mid->FindOutput("Output")));
    ASSERT_TRUE(end->FindInput("Size")->ConnectTo(src->FindOutput("Value")));
    doc->SetPref(PREF_FFWidth, 1280);
    doc->SetPref(PREF_FFFrameRate, 23.976);
    doc->SetGlobalRange(-10, 250.5);
    doc->SetRenderRange(12, 48);
    ExpectStableRoundTrip(*doc);
    Ref<OrvaneDoc> back = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(Load(SaveDocument(*doc), *back).ok);
    Operator *c2 = back->FindTool("Const1"), *a2 = back->FindTool("Anim1"), *src2 = back->FindTool("Src");
    ASSERT_TRUE(c2 && a2 && src2 && a2->FindInput("Center")->Curve());
    EXPECT_TRUE(c2->FindInput("Size")->Constant()->Equals(Number(1.0 / 3.0)));
    EXPECT_TRUE(c2->FindInput("Colors")->Constant()->Equals(*TwoStops()));
    EXPECT_EQ(back->FindTool("Blur_2")->FindInput("Input")->Link(), src2->FindOutput("Output"));
    EXPECT_EQ(back->FindTool("after")->FindInput("Size")->Link(), src2->FindOutput("Value"));
    EXPECT_EQ(a2->FindInput("Center")->Curve()->ToScript(), center.ToScript());
    EXPECT_TRUE(back->GetPrefLong(PREF_FFWidth) == 1280 && !back->PrefIsSet(PREF_FFHeight));
    EXPECT_EQ(std::vector<double>({back->GlobalStart(), back->GlobalEnd(), back->RenderStart(), back->RenderEnd()}),
              std::vector<double>({-10, 250.5, 12, 48}));
}

TEST(DocumentIO, AHandWrittenDocumentComesBackCanonicalWithItsComments) {
    const std::string hand = R"(-- written by hand, in an order of its own
-- orvane-render: --frames 5-50
return Orvane.Document{
  Tools={
    -- the last step
    Zed=DocIOTestTool{Inputs={Input=Alpha.Output;Width=7,Size=3.0,},},
    Alpha = DocIOTestTool { Inputs = {
        Mode = ModeB,          -- a bare word for an ID
        Choice = "soft light",
        Center = {0.25,0.75},
        Size = Curve { {10, 2}, {0,1,Interp="Hold"} },
    } },
    ["Mid"] = DocAlias { Inputs = { Width = 100 } },
  },
  Prefs = { FrameHeight = 720, },
  RenderRange = {5, 50}, Version = 1, GlobalRange={0,200},
}
)";
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(hand, *doc);
    ASSERT_TRUE(r.ok && r.warnings.empty()) << r.error << Joined(r.warnings);
    const std::string canonical = SaveDocument(*doc);
    const ScriptVal root = ScriptVal::FromText(canonical);
    EXPECT_EQ(Keys(&root), (Names{"Version", "Program", "GlobalRange", "RenderRange", "Prefs", "Tools"}));
    EXPECT_EQ(Keys(root.Find("Tools")), (Names{"Alpha", "Mid", "Zed"}));
    // Declaration order; defaults are not added (Width's neither, though it asks to be saved), but one the document
    // gave stays.
    for (const auto &[tool, keys] : {std::pair<const char *, Names>{"Zed", {"Size", "Width", "Input"}},
                                     {"Alpha", {"Size", "Center", "Mode", "Choice"}},
                                     {"Mid", {"Width"}}})
        EXPECT_EQ(InputKeys(canonical, tool), keys) << tool;
    EXPECT_EQ(ToolIn(canonical, "Mid").ClassName(), DocToolClass) << "an alias is saved as the class's ID";
    // A choice by its number, keys in time order.
    const ScriptVal alpha = *ToolIn(canonical, "Alpha").Find("Inputs");
    EXPECT_EQ(alpha.Find("Choice")->ToText() + " " + alpha.Find("Size")->ToText(),
              "1 Curve {\n\t{ 0, 1, Interp = \"Hold\" },\n\t{ 10, 2 },\n}");
    // The leading block, a comment before a tool and one after an input's value stay where they were.
    for (const char *kept :
         {"-- written by hand, in an order of its own\n-- orvane-render: --frames 5-50\n"
          "Orvane.Document {\n",
          "\t\t-- the last step\n\t\tZed = DocIOTestTool {", "\"ModeB\", -- a bare word for an ID\n"})
        EXPECT_NE(canonical.find(kept), std::string::npos) << kept << "\n" << canonical;
    ExpectStableRoundTrip(*doc);
    // Editing keeps them; removing a tool drops its own.
    ts::SetNumber(doc->FindTool("Alpha"), "Size", 5);
    EXPECT_NE(SaveDocument(*doc).find("-- a bare word for an ID"), std::string::npos);
    doc->RemoveTool("Zed");
    EXPECT_EQ(SaveDocument(*doc).find("-- the last step"), std::string::npos);
}

TEST(DocumentIO, OnlyValuesThatDifferFromTheirDefaultsAreWrittenAndValuesReadAreChecked) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Operator *u = AddDocTool(*doc, "U1"), *same = AddDocTool(*doc, "Same"), *changed = AddDocTool(*doc, "Changed");
    ts::SetNumbers(same, {{"Size", 1.0}, {"Width", 100}});
    ts::SetPoint(same, "Center", 0.5, 0.5);
    ts::SetID(same, "Mode", "ModeA");
    ASSERT_TRUE(same->FindInput("Colors")->SetValue(MakeRef<Gradient>()));
    ASSERT_TRUE(same->FindInput("Caption")->SetValue(MakeRef<Text>("")));
    ts::SetNumber(AddDocTool(*doc, "Unsaved"), "Histo", 5.0);
    ASSERT_TRUE(AddDocTool(*doc, "UnsavedLink")->FindInput("Histo")->ConnectTo(u->FindOutput("Value")));
    ts::SetNumber(changed, "Width", 3.0);
    ts::SetID(changed, "Mode", "ModeB");
    ts::SetNumber(changed, "Size", 0.0);
    ASSERT_TRUE(AddDocTool(*doc, "Curve")->FindInput("Size")->SetCurve(ts::NumberCurve({{0, 1.0}})));
    ASSERT_TRUE(AddDocTool(*doc, "Linked")->FindInput("Input")->ConnectTo(u->FindOutput("Output")));
    const std::string text = SaveDocument(*doc);
    for (const auto &[tool, keys] : {std::pair<const char *, Names>{"U1", {}},
                                     {"Same", {}},
                                     {"Unsaved", {}},
                                     {"UnsavedLink", {}},
                                     {"Changed", {"Size", "Mode", "Width"}},
                                     {"Curve", {"Size"}},
                                     {"Linked", {"Input"}}})
        EXPECT_EQ(InputKeys(text, tool), keys) << tool << "\n" << text;
    ExpectStableRoundTrip(*doc);
    // Name = value for tool A1; the problem ("" when it loads); the value set when loaded leniently ("": left alone).
    const std::tuple<const char *, const char *, const char *> cases[] = {
        {"Size = 2", "", "2"},
        {"Size = -2", "A1.Size: -2 is below the least allowed value 0", "0"},
        {"Size = 0/0", "A1.Size: expects a finite number, got 0/0", "1"},
        {"Size = 1/0", "A1.Size: expects a finite number, got 1/0", "1"},
        {"Size = \"big\"", "A1.Size: expects a number, got \"big\"", "1"},
        {"Size = big", "A1.Size: expects a number or Tool.Output, not 'big'", "1"},
        {"Size = Curve { { 0, 1 }, { 5, -1 } }", "A1.Size: a key: -1 is below the least allowed value 0", ""},
        {"Width = 1001", "A1.Width: 1001 is above the greatest allowed value 1000", "1000"},
        {"Width = 2.5", "A1.Width: 2.5 is not a whole number", "3"},
        {"Center = 3", "A1.Center: expects a point { x, y }, got 3", "{ 0.5, 0.5 }"},
        {"Center = { 1, 0/0 }", "A1.Center: expects a finite number, got 0/0", "{ 0.5, 0.5 }"},
        {"Caption = 4", "A1.Caption: expects a text, got 4", "\"\""},
        {"Mode = \"mode b\"", "", "\"ModeB\""},
        {"Mode = \"Mode B\"", "", "\"ModeB\""},
        {"Mode = ModeOld", "", "\"ModeOld\""},
        {"Mode = \"ModeC\"", "A1.Mode: no choice 'ModeC' (did you mean 'ModeA'?)", "\"ModeA\""},
        {"Mode = \"Zebra\"", "A1.Mode: no choice 'Zebra' (choices: ModeA, ModeB)", "\"ModeA\""},
        {"Choice = \"Third\"", "", "2"},
        {"Choice = SoftLight", "", "1"},
        {"Choice = 3", "A1.Choice: 3 is not a choice (0 First, 1 Soft Light, 2 Third)", "3"},
        {"Choice = \"Thrid\"", "A1.Choice: no choice 'Thrid' (did you mean 'Third'?)", "0"},
        {"Colors = 5", "A1.Colors: expects a gradient, got 5", ""},
        {"Input = 3", "A1.Input: expects a link to an image output (Tool.Output)", ""},
        {"Input = Nowhere.Output", "A1.Input: links to an unknown tool 'Nowhere'", ""},
        {"Input = B2.Output", "A1.Input: links to an unknown tool 'B2' (did you mean 'B1'?)", ""},
        {"Input = B1.Outptu", "A1.Input: tool 'B1' has no output 'Outptu' (did you mean 'Output'?)", ""},
        {"Input = B1.Value", "A1.Input: cannot take B1.Value", ""},
    };
    for (const auto &[value, problem, leniently] : cases) {
        SCOPED_TRACE(value);
        const std::string text = "Orvane.Document { Tools = {\n\tA1 = DocIOTestTool { Inputs = { " +
                                 std::string(value) + " } },\n\tB1 = DocIOTestTool {} } }";
        for (const bool lenient : {false, true}) {
            Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
            const DocumentLoadResult r = Load(text, *doc, lenient);
            EXPECT_EQ(r.ok, lenient || !*problem) << r.error;
            ASSERT_EQ(r.problems.size(), *problem ? 1u : 0u) << r.error << Joined(r.warnings);
            // A problem is an error only when loading strictly, and stands where the value starts.
            const int column = static_cast<int>(text.find(value) + std::string(value).find('=') + 2 - text.find('\n'));
            for (const DocumentProblem &p : r.problems)
                EXPECT_EQ(std::tuple(p.error, p.message.substr(0, strlen(problem)), p.line, p.column),
                          std::tuple(!lenient, std::string(problem), 2, column));
            if (!lenient || !*leniently) continue;
            const Input *in = doc->FindTool("A1")->FindInput(std::string(value, std::string(value).find(' ')).c_str());
            EXPECT_EQ(in->Constant() ? in->Constant()->ToScript().ToText() : "none", leniently);
        }
    }
}

TEST(DocumentIO, EveryProblemOfADocumentIsReportedInTextOrder) {
    const std::string text = R"(Orvane.Document {
	RenderRange = { 10, 1 },
	GlobalRange = { 0, 1e12 },
	Versoin = 2,
	Prefs = { FrameWidht = 2, FrameHeight = "tall" },
	Tools = {
		A1 = DocIOTestTool { Inputs = { Sise = 2, Size = 3, Size = 4, Input = B1.Output } },
		B1 = DocIOTestTool { Inputs = { Input = A1.Output } },
		C1 = DocIOTestTol {},
		["2D"] = DocIOTestTool {},
		D1 = 5,
	},
}
)";
    const std::vector<std::pair<int, std::string>> expected = {
        {2, "RenderRange is reversed: it starts at 10, after its end 1"},
        {3, "GlobalRange covers 1000000000001 frames; at most 10000000 are allowed"},
        {4, "unknown document entry 'Versoin' (did you mean 'Version'?) is kept as it is"},
        {5, "unknown preference \"FrameWidht\" (did you mean 'FrameWidth'?) is kept as it is"},
        {5, "Prefs.FrameHeight: expects a finite number, got \"tall\""},
        {7, "A1: unknown input 'Sise' (did you mean 'Size'?); it is kept as it is"},
        {7, "'Size' is given twice (first at line 7)"},
        {8, "B1.Input: the link to A1.Output closes a loop; it is taken out"},
        {9, "C1: unknown class 'DocIOTestTol' (did you mean 'DocIOTestTool'?); the tool is kept as it is"},
        {10, "'2D' is not a tool name (letters, digits and _, not starting with a digit)"},
        {11, "D1: expected Name = Class { ... }"},
    };
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc);
    EXPECT_FALSE(r.ok);
    std::vector<std::pair<int, std::string>> found;
    for (const DocumentProblem &p : r.problems) found.emplace_back(p.line, p.message);
    EXPECT_EQ(found, expected) << r.error << "\n" << Joined(r.warnings);
    // The loop is broken where it closed, so the document that remains can be walked.
    EXPECT_NE(doc->FindTool("A1")->FindInput("Input")->Link(), nullptr);
    EXPECT_EQ(doc->FindTool("B1")->FindInput("Input")->Link(), nullptr);
}

TEST(DocumentIO, SyntaxErrorsFailAtOnceAndLenientLoadingKeepsWhatItDoesNotKnow) {
    for (const auto &[text, problem] : {
             std::pair<std::string, std::string>{
                 "Orvane.Document {\n\tTools = {\n\t\tA = DocIOTestTool { Inputs = { Size = @ } },\n\t},\n}\n",
                 "line 3, column 41: unexpected symbol '@'"},
             {"Orvane.Document {\n\tVersion = 1\n\tGlobalRange = { 0, 10 },\n}\n", "line 3, column 2: "},
             {"Orvane.Document { GlobalRange = { -x, 10 } }", "line 1, column 35: '-' must be followed by a number"},
             {"Project { Tools = { } }", "line 1, column 1: not an Orvane document"},
             {"42", "not an Orvane document"},
             {"Orvane.Document { Tools = 5 }", "line 1, column 27: Tools must be a table"},
         })
        for (const bool lenient : {false, true}) {
            Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
            const DocumentLoadResult r = Load(text, *doc, lenient);
            EXPECT_FALSE(r.ok);
            ASSERT_EQ(r.problems.size(), 1u) << r.error;
            EXPECT_NE(r.error.find(problem), std::string::npos) << r.error;
            EXPECT_TRUE(doc->Tools().empty());
        }
    const std::string text = R"(Orvane.Document {
	Layout = { Zoom = 2, Views = { "A", "B" } },
	Prefs = { FrameWidth = 1280, FuturePref = { Mode = "fast" } },
	Tools = {
		A1 = DocIOTestTool {
			Inputs = { Bogus = { 1, 2, Deep = { x = "y" } }, Size = Mystery1.Amount, Input = Mystery1.Output },
			ViewInfo = OperatorInfo { Pos = { 1, 2 } },
		},
		Mystery1 = FancyThing {
			Inputs = { Foo = 3, Baz = Curve { { 0, 1 }, { 5, 2, Interp = "Smooth" } }, Src = A1.Output },
			Extra = "kept",
		},
	},
}
)";
    Ref<OrvaneDoc> strict = MakeRef<OrvaneDoc>(), doc = MakeRef<OrvaneDoc>(), again = MakeRef<OrvaneDoc>();
    EXPECT_FALSE(Load(text, *strict).ok);
    const DocumentLoadResult r = Load(text, *doc, true);
    ASSERT_TRUE(r.ok) << r.error;
    EXPECT_EQ(r.warnings.size(), 6u) << Joined(r.warnings); // Layout, FuturePref, FancyThing, Bogus, two links
    EXPECT_TRUE(!doc->FindTool("Mystery1") && doc->GetPrefLong(PREF_FFWidth) == 1280);
    EXPECT_EQ(doc->FindTool("A1")->FindInput("Input")->UnresolvedLink(), "Mystery1.Output");
    const std::string saved = SaveDocument(*doc);
    const ScriptVal source = ScriptVal::FromText(text), root = ScriptVal::FromText(saved), a1 = ToolIn(saved, "A1");
    EXPECT_EQ(root.Find("Layout")->ToText(), source.Find("Layout")->ToText());
    EXPECT_EQ(root.Find("Prefs")->Find("FuturePref")->ToText(), "{ Mode = \"fast\" }");
    EXPECT_EQ(ToolIn(saved, "Mystery1"), *source.Find("Tools")->Find("Mystery1"));
    EXPECT_EQ(InputKeys(saved, "A1"), (Names{"Size", "Input", "Bogus"}));
    EXPECT_EQ(a1.Find("Inputs")->Find("Size")->ToText(), "Mystery1.Amount");
    EXPECT_EQ(*a1.Find("ViewInfo"), *source.Find("Tools")->Find("A1")->Find("ViewInfo"));
    ASSERT_TRUE(Load(saved, *again, true).ok);
    EXPECT_EQ(SaveDocument(*again), saved);
    // A value set later takes the place of the unresolved link.
    ts::SetNumber(doc->FindTool("A1"), "Size", 4.0);
    EXPECT_EQ(ToolIn(SaveDocument(*doc), "A1").Find("Inputs")->Find("Size")->ToText(), "4");
}

TEST(DocumentIO, APlannedToolKeepsItsSettingsAndAnyNameOfAClassIsSavedByItsID) {
    ts::LoadOperators();
    const std::string text = "Orvane.Document { Tools = { Src1 = DocIOTestTool {}, Glow1 = Glow { Inputs = { "
                             "Input = Src1.Output, XBlurSize = 4.5, Filter = \"Gaussian\", Lockxy = true } } } }";
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc);
    ASSERT_TRUE(r.ok && r.warnings.size() == 1u) << r.error << Joined(r.warnings);
    EXPECT_NE(r.warnings[0].find("Glow1: the Glow tool is not available yet"), std::string::npos) << r.warnings[0];
    const ScriptVal was = *ScriptVal::FromText(text).Find("Tools")->Find("Glow1")->Find("Inputs");
    const ScriptVal now = *ToolIn(SaveDocument(*doc), "Glow1").Find("Inputs");
    EXPECT_EQ(now.Size(), was.Size());
    for (const auto &[key, value] : was.Entries()) EXPECT_EQ(now.Find(key)->ToText(), value.ToText());
    // An old ID, an alias, and an alias of this file's class.
    for (const auto &[written, saved] :
         {std::pair{"SetBgColor", "SetCanvasColor"}, {"Resize", "BetterResize"}, {"DocAlias", DocToolClass}}) {
        Ref<OrvaneDoc> named = MakeRef<OrvaneDoc>();
        ASSERT_TRUE(Load(std::string("Orvane.Document { Tools = { T1 = ") + written + " { } } }", *named).ok);
        EXPECT_EQ(named->FindTool("T1")->ClassID(), OvID(saved));
        EXPECT_EQ(ToolIn(SaveDocument(*named), "T1").ClassName(), saved);
    }
}

std::string ReadFile(const std::string &p) {
    return std::string(std::istreambuf_iterator<char>(std::ifstream(p, std::ios::binary).rdbuf()), {});
}
void WriteFile(const std::string &p, const std::string &text) { std::ofstream(p, std::ios::binary) << text; }

TEST(DocumentIO, SavingReplacesAFileWholeOrLeavesWhatWasThereAndOnlyFilesAreRead) {
    namespace fs = std::filesystem;
    const ts::TempDir dir;
    auto entries = [&] {
        std::set<std::string> names;
        for (const auto &e : fs::directory_iterator(dir.path)) names.insert(e.path().filename().string());
        return names;
    };
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>(), back = MakeRef<OrvaneDoc>();
    ts::SetNumber(AddDocTool(*doc, "T1"), "Size", 7.0);
    const std::string target = dir / "comp.orv";
    std::string error;
    for (const bool existing : {false, true}) {
        if (existing) WriteFile(target, std::string(10000, 'x'));
        ASSERT_TRUE(SaveDocumentFile(*doc, target, error)) << error;
        EXPECT_EQ(ReadFile(target), SaveDocument(*doc));
        EXPECT_EQ(entries(), std::set<std::string>{"comp.orv"}) << "no temporary file remains";
    }
    const DocumentLoadResult r = LoadDocumentFile(target, *back);
    ASSERT_TRUE(r.ok) << r.error;
    EXPECT_EQ(SaveDocument(*back), SaveDocument(*doc));
    // Failed saves, under a plain file and onto a folder, leave both as they were.
    fs::remove(target);
    WriteFile(dir / "plain", "not a folder");
    EXPECT_FALSE(SaveDocumentFile(*doc, dir / "plain/comp.orv", error));
    fs::create_directory(dir / "taken");
    WriteFile(dir / "taken/inside", "keep");
    EXPECT_FALSE(SaveDocumentFile(*doc, dir / "taken", error));
    EXPECT_EQ(ReadFile(dir / "plain") + ReadFile(dir / "taken/inside"), "not a folderkeep");
    EXPECT_EQ(entries(), (std::set<std::string>{"plain", "taken"})) << "no temporary file remains";
    // Reading: a missing file, a folder, and a FIFO with no writer (which must not wait for one).
    ASSERT_EQ(mkfifo((dir / "pipe").c_str(), 0600), 0);
    for (const auto &[name, says] : {std::pair{"absent.orv", "cannot open"}, std::pair{"taken", "not a regular file"},
                                     std::pair{"pipe", "not a regular file"}}) {
        const DocumentLoadResult failed = LoadDocumentFile(dir / name, *MakeRef<OrvaneDoc>());
        EXPECT_FALSE(failed.ok || failed.error.find(says) == std::string::npos ||
                     failed.error.find(name) == std::string::npos)
            << failed.error;
    }
    // Into a read-only folder (folder permissions do not bind the superuser).
    if (geteuid() == 0) return;
    WriteFile(target, "the old document");
    fs::permissions(dir.path, fs::perms::owner_read | fs::perms::owner_exec);
    EXPECT_FALSE(SaveDocumentFile(*doc, target, error) || error.empty());
    fs::permissions(dir.path, fs::perms::owner_all);
    EXPECT_EQ(ReadFile(target), "the old document");
}

} // namespace
} // namespace Orvane::documentiotest
