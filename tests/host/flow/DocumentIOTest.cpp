// Flow documents as text: exact round trips, the canonical layout and the
// comments a writer left, what is written and what is not, every problem of a
// document reported at once with its place, lenient loading that keeps what
// this program does not know, class names, and atomic saving.
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/core/Registry.h"
#include "host/core/ScriptVal.h"
#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/Gradient.h"
#include "host/flow/Request.h"
#include "tests/support/TestSupport.h"

namespace Orvane::documentiotest {
namespace ts = ::Orvane::Test;
namespace {

/// A tool with one input of each kind a document stores, declared in the
/// order Size, Center, Caption, Mode, Colors, Width, Histo, Choice, Input.
class DocTool : public ThreadedOperator {
public:
    DocTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        AddInputTagList("Size", "Size",
                        {{LinkDataType, CLSID_DataType_Number}, {InputDefault, 1.0}, {InputMinAllowed, 0.0}});
        AddInputTagList("Center", "Center",
                        {{LinkDataType, CLSID_DataType_Point}, {InputDefaultX, 0.5}, {InputDefaultY, 0.5}});
        AddInputTagList("Caption", "Caption", {{LinkDataType, CLSID_DataType_Text}});
        AddInputTagList("Mode", "Mode",
                        {{LinkDataType, CLSID_DataType_OvID},
                         {InputDefaultId, OvID("ModeA")},
                         {ListAddItem, "Mode A"},
                         {ListItemId, OvID("ModeA")},
                         {ListAddItem, "Mode B"},
                         {ListItemId, OvID("ModeB")},
                         {ListAcceptedId, OvID("ModeOld")}});
        AddInputTagList("Colors", "Colors", {{LinkDataType, CLSID_DataType_Gradient}});
        AddInputTagList("Width", "Width",
                        {{LinkDataType, CLSID_DataType_Number},
                         {InputDefault, 100.0},
                         {InputInteger, 1},
                         {InputMaxAllowed, 1000.0},
                         {LinkForceSave, 1}});
        AddInputTagList("Histo", "Histo", {{LinkDataType, CLSID_DataType_Number}, {LinkNotSaved, 1}});
        AddInputTagList("Choice", "Choice",
                        {{LinkDataType, CLSID_DataType_Number},
                         {ListAddItem, "First"},
                         {ListAddItem, "Soft Light"},
                         {ListAddItem, "Third"}});
        AddInputTagList("Input", "Input", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {InputRequired, 0}});
        output = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
        AddOutputTagList("Value", "Value", {{LinkDataType, CLSID_DataType_Number}});
    }
    void Process(Request *req) override { req->SetOutputData(output, req->GetInputData(FindInput("Input"))); }
    Output *output;
};

Object *MakeDocTool(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new DocTool(reg, args, tags);
}

const char *const DocToolClass = "DocIOTestTool";

void RegisterOnce() {
    static const bool done = [] {
        TagList tags{{RegConstructor, &MakeDocTool},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)},
                     {RegAbbreviation, "DT"},
                     {RegName, "Doc Test Tool"},
                     {RegAlias, "DocAlias"},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1}};
        Registry::_Init(&ClassRegistry, OvID(DocToolClass), tags);
        return true;
    }();
    (void)done;
}

Operator *AddDocTool(OrvaneDoc &doc, const std::string &name) {
    RegisterOnce();
    Operator *op = doc.AddTool(OvID(DocToolClass), name);
    EXPECT_NE(op, nullptr) << name;
    return op;
}

DocumentLoadResult Load(const std::string &text, OrvaneDoc &doc, bool lenient = false) {
    RegisterOnce();
    return LoadDocument(text, doc, {.lenient = lenient});
}

/// The table of one tool in saved text.
ScriptVal ToolIn(const std::string &text, const std::string &tool) {
    const ScriptVal root = ScriptVal::FromText(text);
    const ScriptVal *t = root.Find("Tools")->Find(tool);
    return t ? *t : ScriptVal();
}

std::vector<std::string> Keys(const ScriptVal *table) {
    std::vector<std::string> keys;
    if (table && table->IsTable())
        for (const auto &[k, v] : table->Entries()) keys.push_back(k.IsText() ? k.AsText() : k.ToText());
    return keys;
}
std::vector<std::string> InputKeys(const std::string &text, const std::string &tool) {
    const ScriptVal t = ToolIn(text, tool);
    return Keys(t.Find("Inputs"));
}

std::string Joined(const std::vector<std::string> &lines) {
    std::string all;
    for (const std::string &l : lines) all += l + "\n";
    return all;
}

/// Saves, loads into a fresh document, saves again: both texts must match, and so must a third generation.
void ExpectStableRoundTrip(const OrvaneDoc &doc) {
    const std::string first = SaveDocument(doc);
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(first, *again);
    ASSERT_TRUE(r.ok) << r.error << "\n" << first;
    EXPECT_TRUE(r.warnings.empty()) << Joined(r.warnings);
    const std::string second = SaveDocument(*again);
    EXPECT_EQ(second, first);
    Ref<OrvaneDoc> third = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(Load(second, *third).ok);
    EXPECT_EQ(SaveDocument(*third), first);
}

Ref<Gradient> TwoStops() {
    return MakeRef<Gradient>(std::vector<GradientStop>{{0.0, 1.f, 0.f, 0.f, 1.f}, {0.5, 0.f, 1.f, 0.f, 0.5f}});
}

TEST(DocumentIO, SaveLoadSaveGivesTheSameBytes) {
    struct Case {
        const char *name;
        void (*build)(OrvaneDoc &);
    };
    const Case cases[] = {
        {"empty", [](OrvaneDoc &) {}},
        {"constants",
         [](OrvaneDoc &doc) {
             Operator *t = AddDocTool(doc, "Const1");
             ts::SetNumber(t, "Size", 1.0 / 3.0);
             ts::SetPoint(t, "Center", 0.1 + 0.2, -1e-300);
             ASSERT_TRUE(
                 t->FindInput("Caption")->SetValue(MakeRef<Text>("tab\there \"quoted\"\nnext line \\ caf\xc3\xa9")));
             ts::SetID(t, "Mode", "ModeB");
             ts::SetNumber(t, "Choice", 2);
             ASSERT_TRUE(t->FindInput("Colors")->SetValue(TwoStops()));
             ts::SetNumber(AddDocTool(doc, "Const2"), "Size", 1e21);
         }},
        {"curves",
         [](OrvaneDoc &doc) {
             Operator *t = AddDocTool(doc, "Anim1");
             AnimCurve size;
             size.SetKey(0, MakeRef<Number>(1.0));
             size.SetKey(12, MakeRef<Number>(2.25), KeyInterp::Smooth);
             size.SetKey(24, MakeRef<Number>(3.0), KeyInterp::Hold);
             ASSERT_TRUE(t->FindInput("Size")->SetCurve(size));
             AnimCurve center;
             center.SetKey(-5, MakeRef<Point>(0.0, 1.0), KeyInterp::Smooth);
             center.SetKey(5, MakeRef<Point>(1.0, 0.0));
             ASSERT_TRUE(t->FindInput("Center")->SetCurve(center));
             AnimCurve colors;
             colors.SetKey(0, TwoStops());
             colors.SetKey(10, MakeRef<Gradient>());
             ASSERT_TRUE(t->FindInput("Colors")->SetCurve(colors));
         }},
        {"links",
         [](OrvaneDoc &doc) {
             Operator *a = AddDocTool(doc, "Src");
             Operator *b = AddDocTool(doc, "Blur_2");
             Operator *c = AddDocTool(doc, "after");
             ASSERT_TRUE(b->FindInput("Input")->ConnectTo(a->FindOutput("Output")));
             ASSERT_TRUE(c->FindInput("Input")->ConnectTo(b->FindOutput("Output")));
             ASSERT_TRUE(c->FindInput("Size")->ConnectTo(a->FindOutput("Value")));
         }},
        {"preferences and ranges",
         [](OrvaneDoc &doc) {
             doc.SetPref(PREF_FFWidth, 1280);
             doc.SetPref(PREF_FFFrameRate, 23.976);
             doc.SetGlobalRange(-10, 250.5);
             doc.SetRenderRange(12, 48);
             AddDocTool(doc, "One");
         }},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        c.build(*doc);
        if (HasFatalFailure()) return;
        ExpectStableRoundTrip(*doc);
    }
}

TEST(DocumentIO, LoadingRestoresWhatWasSaved) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Operator *a = AddDocTool(*doc, "A1");
    Operator *b = AddDocTool(*doc, "B1");
    ts::SetNumber(a, "Size", 0.1);
    ASSERT_TRUE(b->FindInput("Input")->ConnectTo(a->FindOutput("Output")));
    ASSERT_TRUE(b->FindInput("Size")->ConnectTo(a->FindOutput("Value")));
    AnimCurve curve;
    curve.SetKey(2, MakeRef<Point>(1.0, 2.0), KeyInterp::Smooth);
    curve.SetKey(4, MakeRef<Point>(3.0, 4.0), KeyInterp::Hold);
    ASSERT_TRUE(a->FindInput("Center")->SetCurve(curve));
    doc->SetPref(PREF_FFHeight, 576);
    doc->SetGlobalRange(3, 33);
    doc->SetRenderRange(4, 5);

    Ref<OrvaneDoc> back = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(Load(SaveDocument(*doc), *back).ok);
    Operator *a2 = back->FindTool("A1");
    Operator *b2 = back->FindTool("B1");
    ASSERT_TRUE(a2 && b2);
    EXPECT_TRUE(a2->FindInput("Size")->Constant()->Equals(Number(0.1)));
    EXPECT_EQ(b2->FindInput("Input")->Link(), a2->FindOutput("Output"));
    EXPECT_EQ(b2->FindInput("Size")->Link(), a2->FindOutput("Value"));
    const AnimCurve *c = a2->FindInput("Center")->Curve();
    ASSERT_NE(c, nullptr);
    ASSERT_EQ(c->Keys().size(), 2u);
    EXPECT_EQ(c->Keys()[0].interp, KeyInterp::Smooth);
    EXPECT_TRUE(c->Keys()[1].value->Equals(Point(3.0, 4.0)));
    EXPECT_EQ(back->GetPrefLong(PREF_FFHeight), 576);
    EXPECT_FALSE(back->PrefIsSet(PREF_FFWidth));
    EXPECT_EQ(std::vector<double>({back->GlobalStart(), back->GlobalEnd(), back->RenderStart(), back->RenderEnd()}),
              std::vector<double>({3, 33, 4, 5}));
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
    ASSERT_TRUE(r.ok) << r.error;
    EXPECT_TRUE(r.warnings.empty()) << Joined(r.warnings);
    const std::string canonical = SaveDocument(*doc);
    const ScriptVal root = ScriptVal::FromText(canonical);
    EXPECT_EQ(Keys(&root),
              (std::vector<std::string>{"Version", "Program", "GlobalRange", "RenderRange", "Prefs", "Tools"}));
    EXPECT_EQ(Keys(root.Find("Tools")), (std::vector<std::string>{"Alpha", "Mid", "Zed"}));
    // Declaration order; defaults are not added (Width's neither, though it asks to be saved), but one the document
    // gave stays.
    EXPECT_EQ(InputKeys(canonical, "Zed"), (std::vector<std::string>{"Size", "Width", "Input"}));
    EXPECT_EQ(InputKeys(canonical, "Alpha"), (std::vector<std::string>{"Size", "Center", "Mode", "Choice"}));
    EXPECT_EQ(InputKeys(canonical, "Mid"), std::vector<std::string>{"Width"});
    EXPECT_EQ(ToolIn(canonical, "Mid").ClassName(), DocToolClass) << "an alias is saved as the class's ID";
    EXPECT_EQ(ToolIn(canonical, "Alpha").Find("Inputs")->Find("Choice")->AsNumber(), 1);
    const ScriptVal size = *ToolIn(canonical, "Alpha").Find("Inputs")->Find("Size");
    ASSERT_EQ(size.ArrayLength(), 2u);
    EXPECT_EQ(size.At(1)->At(1)->AsNumber(), 0) << "keys in time order";
    // The leading block, a comment before a tool and one after an input's value stay where they were.
    for (const char *kept :
         {"-- written by hand, in an order of its own\n-- orvane-render: --frames 5-50\n"
          "Orvane.Document {\n",
          "\t\t-- the last step\n\t\tZed = DocIOTestTool {", "\"ModeB\", -- a bare word for an ID\n"})
        EXPECT_NE(canonical.find(kept), std::string::npos) << kept << "\n" << canonical;
    // Editing keeps them; removing a tool drops its own.
    ts::SetNumber(doc->FindTool("Alpha"), "Size", 5);
    EXPECT_NE(SaveDocument(*doc).find("-- a bare word for an ID"), std::string::npos);
    doc->RemoveTool("Zed");
    EXPECT_EQ(SaveDocument(*doc).find("-- the last step"), std::string::npos);
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(Load(canonical, *again).ok);
    EXPECT_EQ(SaveDocument(*again), canonical);
}

TEST(DocumentIO, OnlyValuesThatDifferFromTheirDefaultsAreWritten) {
    struct Case {
        const char *name;
        void (*set)(Operator *, Operator *);
        std::vector<std::string> keys;
    };
    const Case cases[] = {
        {"defaults", [](Operator *, Operator *) {}, {}},
        {"values equal to the defaults",
         [](Operator *t, Operator *) {
             ts::SetNumber(t, "Size", 1.0);
             ts::SetPoint(t, "Center", 0.5, 0.5);
             ts::SetID(t, "Mode", "ModeA");
             ts::SetNumber(t, "Width", 100);
             ASSERT_TRUE(t->FindInput("Colors")->SetValue(MakeRef<Gradient>()));
             ASSERT_TRUE(t->FindInput("Caption")->SetValue(MakeRef<Text>("")));
         },
         {}},
        {"a value never saved", [](Operator *t, Operator *) { ts::SetNumber(t, "Histo", 5.0); }, {}},
        {"a value never saved, linked",
         [](Operator *t, Operator *u) { ASSERT_TRUE(t->FindInput("Histo")->ConnectTo(u->FindOutput("Value"))); },
         {}},
        {"changed values",
         [](Operator *t, Operator *) {
             ts::SetNumber(t, "Width", 3.0);
             ts::SetID(t, "Mode", "ModeB");
             ts::SetNumber(t, "Size", 0.0);
         },
         {"Size", "Mode", "Width"}},
        {"a curve holding the default",
         [](Operator *t, Operator *) {
             AnimCurve c;
             c.SetKey(0, MakeRef<Number>(1.0));
             ASSERT_TRUE(t->FindInput("Size")->SetCurve(c));
         },
         {"Size"}},
        {"a link",
         [](Operator *t, Operator *u) { ASSERT_TRUE(t->FindInput("Input")->ConnectTo(u->FindOutput("Output"))); },
         {"Input"}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        Operator *t = AddDocTool(*doc, "T1");
        Operator *u = AddDocTool(*doc, "U1");
        c.set(t, u);
        if (HasFatalFailure()) return;
        const std::string text = SaveDocument(*doc);
        EXPECT_EQ(InputKeys(text, "T1"), c.keys) << text;
        ExpectStableRoundTrip(*doc);
    }
}

TEST(DocumentIO, ValuesAreCheckedAndChoicesTakenByName) {
    struct Case {
        const char *value;     ///< Name = value, for tool A1
        const char *problem;   ///< "" when it loads
        const char *leniently; ///< the value set when loaded leniently ("" when left alone)
    };
    const Case cases[] = {
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
    for (const Case &c : cases) {
        SCOPED_TRACE(c.value);
        const std::string text = "Orvane.Document { Tools = {\n\tA1 = DocIOTestTool { Inputs = { " +
                                 std::string(c.value) + " } },\n\tB1 = DocIOTestTool {} } }";
        for (const bool lenient : {false, true}) {
            Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
            const DocumentLoadResult r = Load(text, *doc, lenient);
            EXPECT_EQ(r.ok, lenient || !*c.problem) << r.error;
            ASSERT_EQ(r.problems.size(), *c.problem ? 1u : 0u) << r.error << Joined(r.warnings);
            if (*c.problem) {
                const DocumentProblem &p = r.problems[0];
                EXPECT_EQ(p.error, !lenient);
                EXPECT_EQ(p.message.rfind(c.problem, 0), 0u) << p.message;
                EXPECT_EQ(p.line, 2);
                const size_t valueAt = text.find(c.value) + std::string(c.value).find('=') + 2;
                EXPECT_EQ(p.column, static_cast<int>(valueAt - text.find('\n'))) << "the value's column";
            }
            if (!lenient || !*c.leniently) continue;
            const std::string name(c.value, std::string(c.value).find(' '));
            const Input *in = doc->FindTool("A1")->FindInput(name.c_str());
            ASSERT_TRUE(in->Constant());
            EXPECT_EQ(in->Constant()->ToScript().ToText(), c.leniently);
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

TEST(DocumentIO, SyntaxErrorsAndNonDocumentsFailAtOnce) {
    struct Case {
        std::string text;
        std::string problem;
    };
    const Case cases[] = {
        {"Orvane.Document {\n\tTools = {\n\t\tA = DocIOTestTool { Inputs = { Size = @ } },\n\t},\n}\n",
         "line 3, column 41: unexpected symbol '@'"},
        {"Orvane.Document {\n\tVersion = 1\n\tGlobalRange = { 0, 10 },\n}\n", "line 3, column 2: "},
        {"Orvane.Document { GlobalRange = { -x, 10 } }", "line 1, column 35: '-' must be followed by a number"},
        {"Project { Tools = { } }", "line 1, column 1: not an Orvane document"},
        {"42", "not an Orvane document"},
        {"Orvane.Document { Tools = 5 }", "line 1, column 27: Tools must be a table"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.text);
        for (const bool lenient : {false, true}) {
            Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
            const DocumentLoadResult r = Load(c.text, *doc, lenient);
            EXPECT_FALSE(r.ok);
            ASSERT_EQ(r.problems.size(), 1u) << r.error;
            EXPECT_NE(r.error.find(c.problem), std::string::npos) << r.error;
            EXPECT_TRUE(doc->Tools().empty());
        }
    }
}

TEST(DocumentIO, LenientLoadingKeepsWhatItDoesNotKnowAndWritesItBack) {
    const std::string text = R"(Orvane.Document {
	Layout = { Zoom = 2, Views = { "A", "B" } },
	Prefs = { FrameWidth = 1280, FuturePref = { Mode = "fast" } },
	Tools = {
		A1 = DocIOTestTool {
			Inputs = {
				Bogus = { 1, 2, Deep = { x = "y" } },
				Size = Mystery1.Amount,
				Input = Mystery1.Output,
			},
			ViewInfo = OperatorInfo { Pos = { 1, 2 } },
		},
		Mystery1 = FancyThing {
			Inputs = { Foo = 3, Baz = Curve { { 0, 1 }, { 5, 2, Interp = "Smooth" } }, Src = A1.Output },
			Extra = "kept",
		},
	},
}
)";
    Ref<OrvaneDoc> strict = MakeRef<OrvaneDoc>();
    EXPECT_FALSE(Load(text, *strict).ok);
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc, true);
    ASSERT_TRUE(r.ok) << r.error;
    EXPECT_EQ(r.warnings.size(), 6u) << Joined(r.warnings); // Layout, FuturePref, FancyThing, Bogus, two links
    EXPECT_EQ(doc->FindTool("Mystery1"), nullptr);
    Operator *a = doc->FindTool("A1");
    EXPECT_EQ(a->FindInput("Input")->UnresolvedLink(), "Mystery1.Output");
    EXPECT_EQ(doc->GetPrefLong(PREF_FFWidth), 1280);

    const std::string saved = SaveDocument(*doc);
    const ScriptVal source = ScriptVal::FromText(text), root = ScriptVal::FromText(saved);
    for (const char *entry : {"Layout"}) EXPECT_EQ(root.Find(entry)->ToText(), source.Find(entry)->ToText());
    EXPECT_EQ(root.Find("Prefs")->Find("FuturePref")->ToText(), "{ Mode = \"fast\" }");
    EXPECT_EQ(ToolIn(saved, "Mystery1"), *source.Find("Tools")->Find("Mystery1"));
    const ScriptVal a1 = ToolIn(saved, "A1");
    EXPECT_EQ(InputKeys(saved, "A1"), (std::vector<std::string>{"Size", "Input", "Bogus"}));
    EXPECT_EQ(a1.Find("Inputs")->Find("Size")->ToText(), "Mystery1.Amount");
    EXPECT_EQ(*a1.Find("ViewInfo"), *source.Find("Tools")->Find("A1")->Find("ViewInfo"));
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(Load(saved, *again, true).ok);
    EXPECT_EQ(SaveDocument(*again), saved);

    // A value set later takes the place of the unresolved link.
    ts::SetNumber(a, "Size", 4.0);
    EXPECT_EQ(ToolIn(SaveDocument(*doc), "A1").Find("Inputs")->Find("Size")->ToText(), "4");
}

TEST(DocumentIO, APlannedToolKeepsItsSettingsWithOneWarning) {
    ts::LoadOperators();
    const std::string text = R"(Orvane.Document {
	Tools = {
		Glow1 = Glow { Inputs = { Input = Src1.Output, XBlurSize = 4.5, Filter = "Gaussian", Lockxy = true } },
		Src1 = DocIOTestTool { },
	},
}
)";
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc);
    ASSERT_TRUE(r.ok) << r.error;
    ASSERT_EQ(r.warnings.size(), 1u) << Joined(r.warnings);
    EXPECT_NE(r.warnings[0].find("Glow1: the Glow tool is not available yet"), std::string::npos) << r.warnings[0];
    const ScriptVal was = *ScriptVal::FromText(text).Find("Tools")->Find("Glow1")->Find("Inputs");
    const ScriptVal now = *ToolIn(SaveDocument(*doc), "Glow1").Find("Inputs");
    EXPECT_EQ(now.Size(), was.Size());
    for (const auto &[key, value] : was.Entries()) EXPECT_EQ(now.Find(key)->ToText(), value.ToText());
    // Asked for a result, it fails with one line.
    Operator *glow = doc->FindTool("Glow1");
    EXPECT_FALSE(Evaluate(glow->FindMainOutput(), 0.0));
    const std::vector<ConsoleLine> lines = doc->ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_NE(lines[0].text.find("is not available yet"), std::string::npos) << lines[0].text;
}

TEST(DocumentIO, AnyNameOfAClassMakesItAndItIsSavedByItsID) {
    ts::LoadOperators();
    const struct {
        const char *written, *saved;
    } cases[] = {{"SetBgColor", "SetCanvasColor"}, // an old ID
                 {"Resize", "BetterResize"},       // an alias
                 {"DocAlias", DocToolClass}};
    for (const auto &c : cases) {
        SCOPED_TRACE(c.written);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        const DocumentLoadResult r =
            Load(std::string("Orvane.Document { Tools = { T1 = ") + c.written + " { } } }", *doc);
        ASSERT_TRUE(r.ok) << r.error;
        EXPECT_EQ(doc->FindTool("T1")->ClassID(), OvID(c.saved));
        EXPECT_EQ(ToolIn(SaveDocument(*doc), "T1").ClassName(), c.saved);
    }
}

// ---- files ---------------------------------------------------------------

struct TempDir {
    std::filesystem::path path;
    explicit TempDir(const std::string &name) {
        path = std::filesystem::temp_directory_path() / ("orvane-doctest-" + name + "-" + std::to_string(getpid()));
        std::filesystem::remove_all(path);
        std::filesystem::create_directories(path);
    }
    ~TempDir() {
        std::error_code ignored;
        std::filesystem::permissions(path, std::filesystem::perms::owner_all, ignored);
        std::filesystem::remove_all(path, ignored);
    }
    std::vector<std::string> Entries() const {
        std::vector<std::string> names;
        for (const auto &e : std::filesystem::directory_iterator(path)) names.push_back(e.path().filename().string());
        std::sort(names.begin(), names.end());
        return names;
    }
};

std::string ReadFile(const std::filesystem::path &p) {
    std::ifstream in(p, std::ios::binary);
    std::ostringstream s;
    s << in.rdbuf();
    return s.str();
}

void WriteFile(const std::filesystem::path &p, const std::string &text) { std::ofstream(p, std::ios::binary) << text; }

Ref<OrvaneDoc> SmallDoc() {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    ts::SetNumber(AddDocTool(*doc, "T1"), "Size", 7.0);
    return doc;
}

TEST(DocumentIO, SavingAFileReplacesItWhole) {
    TempDir dir("replace");
    Ref<OrvaneDoc> doc = SmallDoc();
    const std::filesystem::path target = dir.path / "comp.orv";
    for (const bool existing : {false, true}) {
        SCOPED_TRACE(existing ? "over an existing file" : "a new file");
        if (existing) WriteFile(target, std::string(10000, 'x'));
        std::string error;
        ASSERT_TRUE(SaveDocumentFile(*doc, target.string(), error)) << error;
        EXPECT_EQ(ReadFile(target), SaveDocument(*doc));
        EXPECT_EQ(dir.Entries(), (std::vector<std::string>{"comp.orv"})) << "no temporary file remains";
    }
    Ref<OrvaneDoc> back = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = LoadDocumentFile(target.string(), *back);
    ASSERT_TRUE(r.ok) << r.error;
    EXPECT_EQ(SaveDocument(*back), SaveDocument(*doc));
}

TEST(DocumentIO, AFailedSaveLeavesWhatWasThereAndOnlyFilesAreRead) {
    TempDir dir("fail");
    Ref<OrvaneDoc> doc = SmallDoc();
    WriteFile(dir.path / "plain", "not a folder");
    std::string error;
    EXPECT_FALSE(SaveDocumentFile(*doc, (dir.path / "plain" / "comp.orv").string(), error));
    EXPECT_EQ(ReadFile(dir.path / "plain"), "not a folder");
    std::filesystem::create_directory(dir.path / "taken");
    WriteFile(dir.path / "taken" / "inside", "keep");
    EXPECT_FALSE(SaveDocumentFile(*doc, (dir.path / "taken").string(), error));
    EXPECT_EQ(ReadFile(dir.path / "taken" / "inside"), "keep");
    EXPECT_EQ(dir.Entries(), (std::vector<std::string>{"plain", "taken"})) << "no temporary file remains";

    // Reading: a missing file, a folder, and a FIFO with no writer (which must not wait for one).
    ASSERT_EQ(mkfifo((dir.path / "pipe").c_str(), 0600), 0);
    for (const auto &[name, says] : {std::pair{"absent.orv", "cannot open"}, std::pair{"taken", "not a regular file"},
                                     std::pair{"pipe", "not a regular file"}}) {
        Ref<OrvaneDoc> other = MakeRef<OrvaneDoc>();
        const DocumentLoadResult r = LoadDocumentFile((dir.path / name).string(), *other);
        EXPECT_FALSE(r.ok);
        EXPECT_NE(r.error.find(says), std::string::npos) << r.error;
        EXPECT_NE(r.error.find(name), std::string::npos) << r.error;
    }
}

TEST(DocumentIO, SavingIntoAReadOnlyFolderFailsAndKeepsTheOldFile) {
    if (geteuid() == 0) GTEST_SKIP() << "folder permissions do not bind the superuser";
    TempDir dir("readonly");
    const std::filesystem::path target = dir.path / "comp.orv";
    WriteFile(target, "the old document");
    std::filesystem::permissions(dir.path, std::filesystem::perms::owner_read | std::filesystem::perms::owner_exec);
    std::string error;
    EXPECT_FALSE(SaveDocumentFile(*SmallDoc(), target.string(), error));
    EXPECT_FALSE(error.empty());
    std::filesystem::permissions(dir.path, std::filesystem::perms::owner_all);
    EXPECT_EQ(ReadFile(target), "the old document");
}

} // namespace
} // namespace Orvane::documentiotest
