// Flow documents as text: exact round trips, the canonical layout, what is
// written and what is not, entries this program does not know, planned and
// renamed classes, errors, and atomic saving.
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
/// order Size, Center, Caption, Mode, Colors, Width, Histo, Input.
class DocTool : public ThreadedOperator {
public:
    DocTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        AddInputTagList("Size", "Size", {{LinkDataType, CLSID_DataType_Number}, {InputDefault, 1.0}});
        AddInputTagList("Center", "Center",
                        {{LinkDataType, CLSID_DataType_Point}, {InputDefaultX, 0.5}, {InputDefaultY, 0.5}});
        AddInputTagList("Caption", "Caption", {{LinkDataType, CLSID_DataType_Text}});
        AddInputTagList("Mode", "Mode", {{LinkDataType, CLSID_DataType_OvID}, {InputDefaultId, OvID("ModeA")}});
        AddInputTagList("Colors", "Colors", {{LinkDataType, CLSID_DataType_Gradient}});
        AddInputTagList("Width", "Width",
                        {{LinkDataType, CLSID_DataType_Number}, {InputDefault, 100.0}, {LinkForceSave, 1}});
        AddInputTagList("Histo", "Histo", {{LinkDataType, CLSID_DataType_Number}, {LinkNotSaved, 1}});
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

DocumentLoadResult Load(const std::string &text, OrvaneDoc &doc) {
    RegisterOnce();
    return LoadDocument(text, doc);
}

/// The table of one tool in saved text.
ScriptVal ToolIn(const std::string &text, const std::string &tool) {
    const ScriptVal root = ScriptVal::FromText(text);
    const ScriptVal *tools = root.Find("Tools");
    const ScriptVal *t = tools ? tools->Find(tool) : nullptr;
    return t ? *t : ScriptVal();
}

/// An entry of a table, or nil.
ScriptVal Get(const ScriptVal *table, const char *key) {
    const ScriptVal *v = table && table->IsTable() ? table->Find(key) : nullptr;
    return v ? *v : ScriptVal();
}

/// The keys of a table, in order.
std::vector<std::string> Keys(const ScriptVal *table) {
    std::vector<std::string> keys;
    if (table)
        for (const auto &[k, v] : table->Entries()) keys.push_back(k.IsText() ? k.AsText() : k.ToText());
    return keys;
}
std::vector<std::string> InputKeys(const std::string &text, const std::string &tool) {
    const ScriptVal t = ToolIn(text, tool);
    return Keys(t.IsTable() ? t.Find("Inputs") : nullptr);
}

std::string Joined(const std::vector<std::string> &lines) {
    std::string all;
    for (const std::string &l : lines) all += l + "\n";
    return all;
}

/// Saves, loads into a fresh document, saves again: both texts must match,
/// and so must a third generation.
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
             ts::SetID(t, "Mode", "ModeC");
             ts::SetNumber(t, "Width", -0.0);
             Operator *u = AddDocTool(doc, "Const2");
             ts::SetNumber(u, "Size", 1e21);
             ts::SetPoint(u, "Center", 12345678.875, 2.5e-8);
         }},
        {"gradients",
         [](OrvaneDoc &doc) {
             Operator *t = AddDocTool(doc, "Grad1");
             ASSERT_TRUE(t->FindInput("Colors")->SetValue(TwoStops()));
             Operator *u = AddDocTool(doc, "Grad2");
             ASSERT_TRUE(u->FindInput("Colors")->SetValue(
                 MakeRef<Gradient>(std::vector<GradientStop>{{0.0, 0.f, 0.f, 0.f, 1.f},
                                                             {0.5, 1.f, 0.f, 0.f, 1.f},
                                                             {0.5, 0.f, 0.f, 1.f, 0.25f},
                                                             {1.0, 1.f, 1.f, 1.f, 1.f}})));
         }},
        {"curves",
         [](OrvaneDoc &doc) {
             Operator *t = AddDocTool(doc, "Anim1");
             AnimCurve size;
             size.SetKey(0, MakeRef<Number>(1.0));
             size.SetKey(12, MakeRef<Number>(2.25), KeyInterp::Smooth);
             size.SetKey(24, MakeRef<Number>(-3.0), KeyInterp::Hold);
             size.SetKey(30.5, MakeRef<Number>(0.0));
             ASSERT_TRUE(t->FindInput("Size")->SetCurve(size));
             AnimCurve center;
             center.SetKey(-5, MakeRef<Point>(0.0, 1.0), KeyInterp::Smooth);
             center.SetKey(5, MakeRef<Point>(1.0, 0.0));
             ASSERT_TRUE(t->FindInput("Center")->SetCurve(center));
             AnimCurve caption;
             caption.SetKey(0, MakeRef<Text>("one"), KeyInterp::Hold);
             caption.SetKey(10, MakeRef<Text>("two"));
             ASSERT_TRUE(t->FindInput("Caption")->SetCurve(caption));
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
             ASSERT_TRUE(b->FindInput("Width")->ConnectTo(a->FindOutput("Value")));
         }},
        {"preferences and ranges",
         [](OrvaneDoc &doc) {
             doc.SetPref(PREF_FFWidth, 1280);
             doc.SetPref(PREF_FFHeight, 720);
             doc.SetPref(PREF_FFFrameRate, 23.976);
             doc.SetPref(PREF_FFAspectX, 0.9);
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
    EXPECT_EQ(a2->ClassID(), OvID(DocToolClass));
    EXPECT_TRUE(a2->FindInput("Size")->Constant()->Equals(Number(0.1)));
    ASSERT_NE(b2->FindInput("Input")->Link(), nullptr);
    EXPECT_EQ(b2->FindInput("Input")->Link(), a2->FindOutput("Output"));
    EXPECT_EQ(b2->FindInput("Size")->Link(), a2->FindOutput("Value"));
    const AnimCurve *c = a2->FindInput("Center")->Curve();
    ASSERT_NE(c, nullptr);
    ASSERT_EQ(c->Keys().size(), 2u);
    EXPECT_EQ(c->Keys()[0].time, 2);
    EXPECT_EQ(c->Keys()[0].interp, KeyInterp::Smooth);
    EXPECT_TRUE(c->Keys()[1].value->Equals(Point(3.0, 4.0)));
    EXPECT_EQ(c->Keys()[1].interp, KeyInterp::Hold);
    EXPECT_EQ(back->GetPrefLong(PREF_FFHeight), 576);
    EXPECT_FALSE(back->PrefIsSet(PREF_FFWidth));
    EXPECT_EQ(back->GlobalStart(), 3);
    EXPECT_EQ(back->GlobalEnd(), 33);
    EXPECT_EQ(back->RenderStart(), 4);
    EXPECT_EQ(back->RenderEnd(), 5);
}

TEST(DocumentIO, AHandWrittenLayoutComesBackCanonical) {
    const std::string hand = R"(-- written by hand, in an order of its own
return Orvane.Document{
  Tools={
    Zed=DocIOTestTool{Inputs={Input=Alpha.Output;Width=7,Size=3.0,},},
    Alpha = DocIOTestTool { Inputs = {
        Mode = ModeB,          -- a bare word for an ID
        Center = {0.25,0.75},
        Size = Curve { {10, 2}, {0,1,Interp="Hold"} },
    } },
    ["Mid"] = DocIOTestTool {},
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
    EXPECT_EQ(InputKeys(canonical, "Zed"), (std::vector<std::string>{"Size", "Width", "Input"}));
    EXPECT_EQ(InputKeys(canonical, "Alpha"), (std::vector<std::string>{"Size", "Center", "Mode", "Width"}));
    EXPECT_EQ(InputKeys(canonical, "Mid"), (std::vector<std::string>{"Width"}));
    // Keys of a curve come out in time order.
    const ScriptVal alpha = ToolIn(canonical, "Alpha");
    const ScriptVal alphaInputs = Get(&alpha, "Inputs");
    const ScriptVal size = Get(&alphaInputs, "Size");
    ASSERT_EQ(size.ArrayLength(), 2u);
    EXPECT_EQ(size.At(1)->At(1)->AsNumber(), 0);
    EXPECT_EQ(size.At(2)->At(1)->AsNumber(), 10);
    EXPECT_NE(canonical.find("\tTools = {\n\t\tAlpha = DocIOTestTool {\n\t\t\tInputs = {\n"), std::string::npos)
        << canonical;
    // From here on the text is stable.
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(Load(canonical, *again).ok);
    EXPECT_EQ(SaveDocument(*again), canonical);
    ExpectStableRoundTrip(*again);
}

TEST(DocumentIO, OnlyValuesThatDifferFromTheirDefaultsAreWritten) {
    struct Case {
        const char *name;
        void (*set)(Operator *, Operator *);
        std::vector<std::string> keys;
    };
    const Case cases[] = {
        {"defaults", [](Operator *, Operator *) {}, {"Width"}},
        {"values equal to the defaults",
         [](Operator *t, Operator *) {
             ts::SetNumber(t, "Size", 1.0);
             ts::SetPoint(t, "Center", 0.5, 0.5);
             ts::SetID(t, "Mode", "ModeA");
             ASSERT_TRUE(t->FindInput("Colors")->SetValue(MakeRef<Gradient>()));
             ASSERT_TRUE(t->FindInput("Caption")->SetValue(MakeRef<Text>("")));
         },
         {"Width"}},
        {"a value never saved", [](Operator *t, Operator *) { ts::SetNumber(t, "Histo", 5.0); }, {"Width"}},
        {"a value never saved, linked",
         [](Operator *t, Operator *u) { ASSERT_TRUE(t->FindInput("Histo")->ConnectTo(u->FindOutput("Value"))); },
         {"Width"}},
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
         {"Size", "Width"}},
        {"a link",
         [](Operator *t, Operator *u) { ASSERT_TRUE(t->FindInput("Input")->ConnectTo(u->FindOutput("Output"))); },
         {"Width", "Input"}},
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

TEST(DocumentIO, AnUnknownClassIsKeptAsItWas) {
    const std::string text = R"(Orvane.Document {
	Tools = {
		A1 = DocIOTestTool {
			Inputs = {
				Size = Mystery1.Amount,
				Input = Mystery1.Output,
			},
		},
		Mystery1 = FancyThing {
			Inputs = {
				Foo = 3,
				Bar = { 1, 2, Deep = { x = "y" } },
				Baz = Curve { { 0, 1 }, { 5, 2, Interp = "Smooth" } },
				Src = A1.Output,
			},
			ViewInfo = OperatorInfo { Pos = { 110, -20.5 } },
			Extra = "kept",
		},
	},
}
)";
    const ScriptVal original = *ScriptVal::FromText(text).Find("Tools")->Find("Mystery1");
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc);
    ASSERT_TRUE(r.ok) << r.error;
    ASSERT_EQ(r.warnings.size(), 3u) << Joined(r.warnings);
    int classWarnings = 0, linkWarnings = 0;
    for (const std::string &w : r.warnings) {
        if (w.find("FancyThing") != std::string::npos) ++classWarnings;
        if (w.find("Mystery1.Output") != std::string::npos || w.find("Mystery1.Amount") != std::string::npos)
            ++linkWarnings;
    }
    EXPECT_EQ(classWarnings, 1) << Joined(r.warnings);
    EXPECT_EQ(linkWarnings, 2) << Joined(r.warnings);
    EXPECT_EQ(doc->FindTool("Mystery1"), nullptr);
    Operator *a = doc->FindTool("A1");
    ASSERT_NE(a, nullptr);
    EXPECT_EQ(a->FindInput("Input")->UnresolvedLink(), "Mystery1.Output");

    const std::string saved = SaveDocument(*doc);
    EXPECT_EQ(ToolIn(saved, "Mystery1").ToText(), original.ToText()) << saved;
    EXPECT_TRUE(ToolIn(saved, "Mystery1") == original);
    const ScriptVal a1 = ToolIn(saved, "A1");
    const ScriptVal *inputs = a1.Find("Inputs");
    ASSERT_NE(inputs, nullptr);
    EXPECT_EQ(Get(inputs, "Input").ToText(), "Mystery1.Output");
    EXPECT_EQ(Get(inputs, "Size").ToText(), "Mystery1.Amount") << saved;
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r2 = Load(saved, *again);
    ASSERT_TRUE(r2.ok);
    EXPECT_EQ(r2.warnings.size(), 3u);
    EXPECT_EQ(SaveDocument(*again), saved);

    // A value set later takes the place of the unresolved link.
    ts::SetNumber(a, "Size", 4.0);
    const ScriptVal a1After = ToolIn(SaveDocument(*doc), "A1");
    const ScriptVal *after = a1After.Find("Inputs");
    ASSERT_NE(after, nullptr);
    EXPECT_EQ(Get(after, "Size").ToText(), "4");
    EXPECT_EQ(a->FindInput("Size")->UnresolvedLink(), "");
}

TEST(DocumentIO, AnUnknownInputOfAKnownToolIsKept) {
    const std::string text = R"(Orvane.Document {
	Tools = {
		T1 = DocIOTestTool {
			Inputs = {
				Bogus = { 1, 2, Deep = { x = "y" } },
				Size = 2,
				Width = 5,
			},
			ViewInfo = OperatorInfo { Pos = { 1, 2 } },
		},
	},
}
)";
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc);
    ASSERT_TRUE(r.ok) << r.error;
    ASSERT_EQ(r.warnings.size(), 1u) << Joined(r.warnings);
    EXPECT_NE(r.warnings[0].find("Bogus"), std::string::npos) << r.warnings[0];
    EXPECT_NE(r.warnings[0].find("T1"), std::string::npos) << r.warnings[0];
    const std::string saved = SaveDocument(*doc);
    EXPECT_EQ(InputKeys(saved, "T1"), (std::vector<std::string>{"Size", "Width", "Bogus"}));
    const ScriptVal source = ScriptVal::FromText(text);
    const ScriptVal *was = source.Find("Tools")->Find("T1");
    const ScriptVal now = ToolIn(saved, "T1");
    const ScriptVal nowInputs = Get(&now, "Inputs"), wasInputs = Get(was, "Inputs");
    EXPECT_EQ(Get(&nowInputs, "Bogus").ToText(), Get(&wasInputs, "Bogus").ToText());
    EXPECT_FALSE(Get(&nowInputs, "Bogus").IsNil());
    EXPECT_EQ(Get(&now, "ViewInfo").ToText(), Get(was, "ViewInfo").ToText());
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(Load(saved, *again).ok);
    EXPECT_EQ(SaveDocument(*again), saved);
}

TEST(DocumentIO, AnUnknownDocumentEntryIsKept) {
    const std::string text = R"(Orvane.Document {
	Layout = { Zoom = 2, Views = { "A", "B" } },
	Tools = { T1 = DocIOTestTool { } },
	Notes = "kept as well",
}
)";
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc);
    ASSERT_TRUE(r.ok) << r.error;
    ASSERT_EQ(r.warnings.size(), 2u) << Joined(r.warnings);
    EXPECT_NE(r.warnings[0].find("Layout"), std::string::npos) << r.warnings[0];
    EXPECT_NE(r.warnings[1].find("Notes"), std::string::npos) << r.warnings[1];
    const std::string saved = SaveDocument(*doc);
    const ScriptVal root = ScriptVal::FromText(saved), source = ScriptVal::FromText(text);
    EXPECT_EQ(Get(&root, "Layout").ToText(), Get(&source, "Layout").ToText());
    EXPECT_EQ(Get(&root, "Notes").ToText(), Get(&source, "Notes").ToText());
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(Load(saved, *again).ok);
    EXPECT_EQ(SaveDocument(*again), saved);
}

TEST(DocumentIO, AnUnknownPreferenceIsKeptAndAKnownOneIsApplied) {
    const std::string text = R"(Orvane.Document {
	Prefs = { FrameWidth = 1280, FuturePref = { Mode = "fast" } },
	Tools = { T1 = DocIOTestTool { } },
}
)";
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc);
    ASSERT_TRUE(r.ok) << r.error;
    ASSERT_EQ(r.warnings.size(), 1u) << Joined(r.warnings);
    EXPECT_NE(r.warnings[0].find("FuturePref"), std::string::npos) << r.warnings[0];
    EXPECT_EQ(doc->GetPrefLong(PREF_FFWidth), 1280);
    const ScriptVal saved = ScriptVal::FromText(SaveDocument(*doc));
    const ScriptVal prefs = Get(&saved, "Prefs");
    ASSERT_NE(prefs.Find("FuturePref"), nullptr);
    EXPECT_EQ(prefs.Find("FuturePref")->ToText(), "{ Mode = \"fast\" }");
    EXPECT_EQ(prefs.Find("FrameWidth")->AsNumber(), 1280);
}

TEST(DocumentIO, ToolNamesMustBeIdentifiersSoLinksCanNameThem) {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    for (const char *bad : {"My Tool", "1Blur", "A.B", "", "x-y"}) {
        SCOPED_TRACE(bad);
        EXPECT_FALSE(IsToolName(bad));
        const std::string text = std::string("Orvane.Document { Tools = { [\"") + bad + "\"] = DocIOTestTool {} } }";
        const DocumentLoadResult r = Load(text, *doc);
        EXPECT_FALSE(r.ok);
    }
    for (const char *good : {"Blur1", "_tmp", "A_b9"}) EXPECT_TRUE(IsToolName(good)) << good;
    // Fresh names keep only letters and digits of what they are made from.
    EXPECT_EQ(doc->UniqueName("Brightness / Contrast"), "BrightnessContrast1");
    EXPECT_EQ(doc->UniqueName("3D"), "Tool3D1");
}

TEST(DocumentIO, APlannedToolKeepsItsSettingsWithOneWarning) {
    ts::LoadOperators();
    const std::string text = R"(Orvane.Document {
	Tools = {
		Glow1 = Glow {
			Inputs = {
				Input = Src1.Output,
				XBlurSize = 4.5,
				Filter = "Gaussian",
				Blend = 0.5,
				Lockxy = true,
			},
		},
		Src1 = DocIOTestTool { },
	},
}
)";
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load(text, *doc);
    ASSERT_TRUE(r.ok) << r.error;
    ASSERT_EQ(r.warnings.size(), 1u) << Joined(r.warnings);
    EXPECT_NE(r.warnings[0].find("Glow1"), std::string::npos) << r.warnings[0];
    EXPECT_NE(r.warnings[0].find("not available"), std::string::npos) << r.warnings[0];
    Operator *blur = doc->FindTool("Glow1");
    ASSERT_NE(blur, nullptr);
    EXPECT_TRUE(blur->IsPlaceholder());

    const std::string saved = SaveDocument(*doc);
    const ScriptVal source = ScriptVal::FromText(text);
    const ScriptVal *was = source.Find("Tools")->Find("Glow1")->Find("Inputs");
    const ScriptVal blurNow = ToolIn(saved, "Glow1");
    const ScriptVal now = Get(&blurNow, "Inputs");
    ASSERT_TRUE(now.IsTable()) << saved;
    EXPECT_EQ(now.Size(), was->Size()) << saved;
    for (const auto &[key, value] : was->Entries()) {
        const ScriptVal *kept = now.Find(key);
        ASSERT_NE(kept, nullptr) << key.AsText();
        EXPECT_EQ(kept->ToText(), value.ToText()) << key.AsText();
    }
    Ref<OrvaneDoc> again = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r2 = Load(saved, *again);
    ASSERT_TRUE(r2.ok);
    EXPECT_EQ(r2.warnings.size(), 1u);
    EXPECT_EQ(SaveDocument(*again), saved);

    // Asked for a result, it fails with one line.
    EXPECT_FALSE(Evaluate(blur->FindMainOutput(), 0.0));
    const std::vector<ConsoleLine> lines = doc->ConsoleLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_NE(lines[0].text.find("is not available yet"), std::string::npos) << lines[0].text;
}

TEST(DocumentIO, AnOldClassIDMakesTheClassOfToday) {
    ts::LoadOperators();
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = Load("Orvane.Document { Tools = { Old1 = SetBgColor { } } }", *doc);
    ASSERT_TRUE(r.ok) << r.error;
    Operator *op = doc->FindTool("Old1");
    ASSERT_NE(op, nullptr);
    EXPECT_EQ(op->ClassID(), OvID("SetCanvasColor"));
    const std::string saved = SaveDocument(*doc);
    EXPECT_NE(saved.find("Old1 = SetCanvasColor {"), std::string::npos) << saved;
    EXPECT_EQ(saved.find("SetBgColor"), std::string::npos) << saved;
}

/// Line and column (1-based, a tab counting one) of the first `marker` in `text`.
std::pair<int, int> Where(const std::string &text, const std::string &marker) {
    const size_t at = text.find(marker);
    int line = 1, column = 1;
    for (size_t i = 0; i < at; ++i) {
        if (text[i] == '\n') {
            ++line;
            column = 1;
        } else {
            ++column;
        }
    }
    return {line, column};
}

TEST(DocumentIO, SyntaxErrorsGiveLineAndColumn) {
    struct Case {
        const char *name;
        std::string text;
        std::string marker; ///< where the error lies
    };
    const Case cases[] = {
        {"a stray character",
         "Orvane.Document {\n\tTools = {\n\t\tA = DocIOTestTool { Inputs = { Size = @ } },\n\t},\n}\n", "@"},
        {"a missing separator", "Orvane.Document {\n\tVersion = 1\n\tGlobalRange = { 0, 10 },\n}\n", "GlobalRange"},
        {"a key without value",
         "Orvane.Document {\n\tTools = {\n\t\tA = DocIOTestTool { Inputs = { Size = } },\n\t},\n}\n", "} },"},
        {"a minus without number", "Orvane.Document { GlobalRange = { -x, 10 } }", "-x"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        const DocumentLoadResult r = Load(c.text, *doc);
        EXPECT_FALSE(r.ok);
        const auto [line, column] = Where(c.text, c.marker);
        const std::string where = "line " + std::to_string(line) + ", column " + std::to_string(column);
        EXPECT_NE(r.error.find(where), std::string::npos) << r.error << " (expected " << where << ")";
        EXPECT_EQ(r.error.find('\n'), std::string::npos) << "one line";
        EXPECT_TRUE(doc->Tools().empty());
    }
}

TEST(DocumentIO, BadContentFailsWithOneClearMessage) {
    auto doc1 = [](const std::string &inputs) {
        return "Orvane.Document { Tools = { A1 = DocIOTestTool { Inputs = { " + inputs +
               " } }, B1 = DocIOTestTool { } } }";
    };
    struct Case {
        const char *name;
        std::string text;
        std::vector<std::string> mentions;
    };
    const Case cases[] = {
        {"text for a number", doc1("Size = \"big\""), {"A1.Size", "a number"}},
        {"number for a point", doc1("Center = 3"), {"A1.Center", "a point"}},
        {"point of three", doc1("Center = { 1, 2, 3 }"), {"A1.Center", "a point"}},
        {"number for a text", doc1("Caption = 4"), {"A1.Caption", "a text"}},
        {"number for an ID", doc1("Mode = 5"), {"A1.Mode", "an ID"}},
        {"number for a gradient", doc1("Colors = 5"), {"A1.Colors", "a gradient"}},
        {"number for an image", doc1("Input = 3"), {"A1.Input", "a link"}},
        {"a curve of texts for a number", doc1("Size = Curve { { 0, \"x\" } }"), {"A1.Size", "curve"}},
        {"a link to an unknown tool", doc1("Input = Nowhere.Output"), {"A1.Input", "Nowhere"}},
        {"a link to an unknown output", doc1("Input = B1.Nope"), {"A1.Input", "Nope"}},
        {"a link of the wrong type", doc1("Input = B1.Value"), {"A1.Input", "B1.Value"}},
        {"a link to itself", doc1("Input = A1.Output"), {"A1.Input", "loop"}},
        {"links making a loop",
         "Orvane.Document { Tools = { A1 = DocIOTestTool { Inputs = { Input = B1.Output } },"
         " B1 = DocIOTestTool { Inputs = { Size = A1.Value } } } }",
         {"loop"}},
        {"a root of another class", "Project { Tools = { } }", {"Orvane.Document"}},
        {"a plain table", "{ Tools = { } }", {"Orvane.Document"}},
        {"a number", "42", {"Orvane.Document"}},
        {"tools that are no table", "Orvane.Document { Tools = 5 }", {"Tools"}},
        {"a tool that is no class table", "Orvane.Document { Tools = { A1 = 5 } }", {"A1"}},
        {"inputs that are no table", "Orvane.Document { Tools = { A1 = DocIOTestTool { Inputs = 3 } } }", {"A1"}},
        {"a malformed preference", "Orvane.Document { Prefs = { FrameWidth = \"wide\" } }", {"FrameWidth"}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
        const DocumentLoadResult r = Load(c.text, *doc);
        EXPECT_FALSE(r.ok);
        ASSERT_FALSE(r.error.empty());
        EXPECT_EQ(r.error.find('\n'), std::string::npos) << r.error;
        for (const std::string &m : c.mentions) EXPECT_NE(r.error.find(m), std::string::npos) << r.error;
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

void WriteFile(const std::filesystem::path &p, const std::string &text) {
    std::ofstream out(p, std::ios::binary);
    out << text;
}

Ref<OrvaneDoc> SmallDoc() {
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Operator *t = AddDocTool(*doc, "T1");
    ts::SetNumber(t, "Size", 7.0);
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

TEST(DocumentIO, AFailedSaveLeavesWhatWasThere) {
    TempDir dir("fail");
    Ref<OrvaneDoc> doc = SmallDoc();
    {
        SCOPED_TRACE("the folder is a file");
        WriteFile(dir.path / "plain", "not a folder");
        std::string error;
        EXPECT_FALSE(SaveDocumentFile(*doc, (dir.path / "plain" / "comp.orv").string(), error));
        EXPECT_FALSE(error.empty());
        EXPECT_EQ(ReadFile(dir.path / "plain"), "not a folder");
        EXPECT_EQ(dir.Entries(), (std::vector<std::string>{"plain"}));
    }
    {
        SCOPED_TRACE("the target is a folder");
        std::filesystem::create_directory(dir.path / "taken");
        WriteFile(dir.path / "taken" / "inside", "keep");
        std::string error;
        EXPECT_FALSE(SaveDocumentFile(*doc, (dir.path / "taken").string(), error));
        EXPECT_FALSE(error.empty());
        EXPECT_TRUE(std::filesystem::is_directory(dir.path / "taken"));
        EXPECT_EQ(ReadFile(dir.path / "taken" / "inside"), "keep");
        EXPECT_EQ(dir.Entries(), (std::vector<std::string>{"plain", "taken"})) << "no temporary file remains";
    }
    {
        SCOPED_TRACE("a missing file");
        Ref<OrvaneDoc> other = MakeRef<OrvaneDoc>();
        const DocumentLoadResult r = LoadDocumentFile((dir.path / "absent.orv").string(), *other);
        EXPECT_FALSE(r.ok);
        EXPECT_NE(r.error.find("absent.orv"), std::string::npos) << r.error;
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
    EXPECT_EQ(dir.Entries(), (std::vector<std::string>{"comp.orv"}));
}

} // namespace
} // namespace Orvane::documentiotest
