// The orvane command line, run as a separate process the way scripts and
// render farms run it: help, tools and describe, checking and editing flow
// documents, eval; output, JSON, and exit codes.
#include <gtest/gtest.h>

#include <algorithm>
#include <regex>
#include <sstream>
#include <string>

#include "host/core/ScriptVal.h"
#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

TEST(CliTools, SearchFindsClassesByAliasAndMarksUnbuiltOnes) {
    const CliRun dither = Orvane("tools --search dither");
    EXPECT_EQ(dither.exitCode, 0) << dither.err;
    EXPECT_TRUE(Contains(dither.out, "ChangeDepth")) << dither.out;
    EXPECT_TRUE(Contains(dither.out, "not yet")) << dither.out;
    EXPECT_TRUE(Contains(dither.out, "1 classes")) << dither.out;

    const CliRun shuffle = Orvane("tools --search shuffle");
    EXPECT_TRUE(Contains(shuffle.out, "ChannelBoolean")) << shuffle.out;

    // Abstract bases and hidden classes show only with --all.
    const CliRun all = Orvane("tools --all");
    EXPECT_EQ(all.exitCode, 0);
    EXPECT_TRUE(Contains(all.out, "201 classes")) << all.out.substr(all.out.size() > 200 ? all.out.size() - 200 : 0);
    EXPECT_TRUE(Contains(all.out, "SwitchBase"));
    const CliRun offered = Orvane("tools");
    EXPECT_TRUE(Contains(offered.out, "194 classes"));
    EXPECT_FALSE(Contains(offered.out, "SwitchBase"));
    EXPECT_FALSE(Contains(offered.out, "TeapotMask"));
}

TEST(CliTools, BadArgumentsExitWithUsageCode) {
    EXPECT_EQ(Orvane("tools --bogus").exitCode, 2);
    EXPECT_EQ(Orvane("frobnicate").exitCode, 2);
    EXPECT_EQ(Orvane("").exitCode, 2);
    const CliRun unknown = Orvane("describe NoSuchClass");
    EXPECT_EQ(unknown.exitCode, 2);
    EXPECT_TRUE(Contains(unknown.err, "ERROR: unknown class 'NoSuchClass'")) << unknown.err;
}

TEST(CliDescribe, ShowsIdentityInputsAndState) {
    const CliRun blur = Orvane("describe Glow");
    EXPECT_EQ(blur.exitCode, 0) << blur.err;
    EXPECT_TRUE(Contains(blur.out, "path:          Tools/Effect/Glow")) << blur.out;
    EXPECT_TRUE(Contains(blur.out, "built:         not yet")) << blur.out;
    EXPECT_TRUE(Contains(blur.out, "EffectMask")) << blur.out;
    // An old class ID names the class that replaced it.
    const CliRun old = Orvane("describe SetBgColor");
    EXPECT_EQ(old.exitCode, 0) << old.err;
    EXPECT_TRUE(Contains(old.out, "SetCanvasColor")) << old.out;
}

TEST(CliEval, DocumentErrorsAreOneLineWithExitTwo) {
    TempDir dir;
    const auto syntax = dir.File("syntax.flow", "Orvane.Document {\n\tTools = {\n\t\tA = Blur { Inputs = { x = } },\n");
    const CliRun r = Orvane("eval " + Quote(syntax.string()) + " A");
    EXPECT_EQ(r.exitCode, 2);
    EXPECT_TRUE(Contains(r.err, "ERROR: " + syntax.string() + ":3:")) << r.err;

    const CliRun missing = Orvane("eval " + Quote((dir.Path() / "none.flow").string()) + " A");
    EXPECT_EQ(missing.exitCode, 2);
    EXPECT_TRUE(Contains(missing.err, "cannot open")) << missing.err;

    const auto ok = dir.File("ok.flow", "Orvane.Document { Tools = { Blur1 = Blur {} } }\n");
    const CliRun noTool = Orvane("eval " + Quote(ok.string()) + " Nope");
    EXPECT_EQ(noTool.exitCode, 2);
    EXPECT_TRUE(Contains(noTool.err, "no tool 'Nope'")) << noTool.err;

    const CliRun badSet = Orvane("eval " + Quote(ok.string()) + " Blur1 --set Blur1.NoSuchInput=1");
    EXPECT_EQ(badSet.exitCode, 2);
    EXPECT_TRUE(Contains(badSet.err, "has no input 'NoSuchInput'")) << badSet.err;

    const CliRun badType = Orvane("eval " + Quote(ok.string()) + " Blur1 --set 'Blur1.Blend=\"high\"'");
    EXPECT_EQ(badType.exitCode, 2);
    EXPECT_TRUE(Contains(badType.err, "expects a number")) << badType.err;

    const auto wrong =
        dir.File("wrong.flow", "Orvane.Document { Tools = { Blur1 = Blur { Inputs = { Blend = {} } } } }");
    const CliRun wrongType = Orvane("eval " + Quote(wrong.string()) + " Blur1");
    EXPECT_EQ(wrongType.exitCode, 2);
    EXPECT_TRUE(Contains(wrongType.err, "Blur1.Blend: expects a number")) << wrongType.err;
}

TEST(CliEval, UnknownClassIsKeptWithAWarningAndFailsOnlyWhenAsked) {
    TempDir dir;
    const auto flow = dir.File(
        "unknown.flow", "Orvane.Document { Tools = { X1 = FutureTool { Inputs = { Q = 3 } }, Blur1 = Blur {} } }");
    const CliRun strict = Orvane("eval " + Quote(flow.string()) + " Blur1");
    EXPECT_EQ(strict.exitCode, 2);
    EXPECT_TRUE(Contains(strict.err, "ERROR: " + flow.string() + ":1:34: X1: unknown class 'FutureTool'"))
        << strict.err;
    const CliRun r = Orvane("eval --lenient " + Quote(flow.string()) + " X1");
    EXPECT_EQ(r.exitCode, 2);
    EXPECT_TRUE(Contains(r.err, "WARNING: " + flow.string() + ":1:34: X1: unknown class 'FutureTool'")) << r.err;
    EXPECT_TRUE(Contains(r.err, "ERROR: tool 'X1' is of a class this program does not know")) << r.err;
}

TEST(CliEval, AToolThatIsNotBuiltFailsWithExitThree) {
    TempDir dir;
    const auto flow = dir.File("planned.flow", "Orvane.Document { Tools = { Glow1 = Glow {} } }");
    const CliRun r = Orvane("eval " + Quote(flow.string()) + " Glow1 --json");
    EXPECT_EQ(r.exitCode, 3);
    EXPECT_TRUE(Contains(r.out, "\"ok\": false")) << r.out;
    EXPECT_TRUE(Contains(r.out, "Glow1: the Glow tool is not available yet")) << r.out;
    EXPECT_TRUE(Contains(r.err, "ERROR: Glow1: the Glow tool is not available yet")) << r.err;
}

TEST(CliHelp, EveryCommandHasHelpAndTheProgramAVersion) {
    for (const char *command : {"render", "eval", "check", "new", "add", "set", "connect", "remove", "tools",
                                "describe", "info", "version"}) {
        SCOPED_TRACE(command);
        const CliRun help = Orvane(std::string(command) + " --help");
        EXPECT_EQ(help.exitCode, 0) << help.err;
        EXPECT_EQ(help.out.rfind(std::string("orvane ") + command, 0), 0u) << help.out;
        EXPECT_TRUE(help.err.empty()) << help.err;
    }
    const CliRun version = Orvane("--version");
    EXPECT_EQ(version.exitCode, 0);
    EXPECT_TRUE(std::regex_match(version.out, std::regex("orvane [0-9]+\\.[0-9]+\\.[0-9]+\n"))) << version.out;
    const CliRun bare = Orvane("");
    EXPECT_EQ(bare.exitCode, 2);
    EXPECT_TRUE(Contains(bare.out, "usage: orvane COMMAND")) << "usage goes to standard output";
    const CliRun typo = Orvane("rendr x.flow");
    EXPECT_EQ(typo.exitCode, 2);
    EXPECT_TRUE(Contains(typo.err, "unknown command 'rendr' (did you mean 'render'?)")) << typo.err;
}

/// The input table of a tool in a saved flow.
ScriptVal InputsIn(const std::filesystem::path &flow, const char *tool) {
    const ScriptVal root = ScriptVal::FromText(ReadFile(flow));
    const ScriptVal *inputs = root.Find("Tools")->Find(tool)->Find("Inputs");
    return inputs ? *inputs : ScriptVal();
}

TEST(CliEdit, AFlowIsBuiltAndChangedFromTheCommandLine) {
    TempDir dir;
    const std::string flow = Quote((dir.Path() / "comp.flow").string());
    const std::filesystem::path path = dir.Path() / "comp.flow";
    ASSERT_EQ(Orvane("new " + flow).exitCode, 0);
    EXPECT_EQ(Orvane("new " + flow).exitCode, 2) << "an existing flow is not replaced";
    for (const std::string &step : {
             "add " + flow + " Background Bg Width=64 Height=32 Type=Gradient",
             "add " + flow + " Resize Small Width=32 FilterMethod=\"Catmull-Rom\"",
             "add " + flow + " Merge M1 ApplyMode=Screen",
             "add " + flow + " Saver Out Clip=renders/a.####.exr",
             "connect " + flow + " Small.Input=Bg M1.Background=Small M1.Foreground=Bg.Output Out.Input=M1",
             "set " + flow + " M1.Angle=15 'Small.Height=Curve { { 0, 16 }, { 10, 8 } }'",
         }) {
        const CliRun r = Orvane(step);
        ASSERT_EQ(r.exitCode, 0) << step << "\n" << r.err;
    }
    const ScriptVal small = InputsIn(path, "Small"), merge = InputsIn(path, "M1"), out = InputsIn(path, "Out");
    EXPECT_EQ(ScriptVal::FromText(ReadFile(path)).Find("Tools")->Find("Small")->ClassName(), "BetterResize");
    EXPECT_EQ(small.Find("FilterMethod")->AsNumber(), 5);
    EXPECT_EQ(small.Find("Height")->ClassName(), "Curve");
    EXPECT_EQ(small.Find("Input")->ToText(), "Bg.Output");
    EXPECT_EQ(merge.Find("ApplyMode")->AsNumber(), 1);
    EXPECT_EQ(merge.Find("Foreground")->ToText(), "Bg.Output");
    EXPECT_EQ(out.Find("Clip")->AsText(), "renders/a.####.exr");
    EXPECT_EQ(Orvane("check " + flow).exitCode, 0);

    // A change that fails leaves the file as it was, and says what is wrong.
    const std::string before = ReadFile(path);
    const struct {
        std::string command, says;
    } bad[] = {
        {"set " + flow + " M1.Angle=10 M1.Size=-1", "M1.Size: -1 is below the least allowed value 0"},
        {"set " + flow + " M1.ApplyMode=Scren", "no choice 'Scren' (did you mean 'Screen'?)"},
        {"set " + flow + " M1.Angel=3", "M1 has no input 'Angel' (did you mean 'Angle'?)"},
        {"set " + flow + " Small.Width=wide", "expects a number or Tool.Output, not 'wide'"},
        {"add " + flow + " Blurr B1", "unknown class 'Blurr' (did you mean 'Blur'?)"},
        {"add " + flow + " Blur Bg", "already has a tool 'Bg'"},
        {"connect " + flow + " Bg.Input=Out", "Bg has no input 'Input'"},
        {"connect " + flow + " Small.Input=M1", "would make a loop"},
        {"remove " + flow + " Nobody", "no tool 'Nobody'"},
    };
    for (const auto &b : bad) {
        const CliRun r = Orvane(b.command);
        EXPECT_EQ(r.exitCode, 2) << b.command;
        EXPECT_TRUE(Contains(r.err, b.says)) << b.command << "\n" << r.err;
        EXPECT_EQ(ReadFile(path), before) << b.command;
    }

    // Removing a tool takes its links with it; a comment written by hand survives the edits.
    const std::string commented = "-- made for the test\n" + before;
    dir.File("comp.flow", commented);
    const CliRun removed = Orvane("remove " + flow + " Small");
    EXPECT_EQ(removed.exitCode, 0) << removed.err;
    EXPECT_TRUE(Contains(removed.out, "unlinked M1.Background")) << removed.out;
    EXPECT_EQ(InputsIn(path, "M1").Find("Background"), nullptr);
    EXPECT_EQ(ReadFile(path).rfind("-- made for the test\nOrvane.Document {", 0), 0u) << ReadFile(path);
}

TEST(CliCheck, ListsEveryProblemWithItsPlaceAndTheExamplesPass) {
    TempDir dir;
    const auto flow = dir.File("bad.flow", "Orvane.Document {\n\tRenderRange = { 10, 1 },\n\tTools = {\n"
                                           "\t\tB1 = Blur { Inputs = { Filter = \"Gausian\", XBlurSize = -1 } },\n"
                                           "\t\tM1 = Merge { Inputs = { FilterMethod = 42 } },\n\t},\n}\n");
    const CliRun r = Orvane("check " + Quote(flow.string()));
    EXPECT_EQ(r.exitCode, 2);
    for (const char *line :
         {":2:16: RenderRange is reversed", ":4:35: B1.Filter: no choice 'Gausian' (did you mean 'Gaussian'?)",
          ":4:58: B1.XBlurSize: -1 is below the least allowed value 0",
          ":5:42: M1.FilterMethod: 42 is not a choice (0 Nearest Neighbor"})
        EXPECT_TRUE(Contains(r.err, "ERROR: " + flow.string() + line)) << line << "\n" << r.err;
    EXPECT_TRUE(Contains(r.err, "4 problems")) << r.err;
    const CliRun lenient = Orvane("check --lenient " + Quote(flow.string()));
    EXPECT_EQ(lenient.exitCode, 0) << lenient.err;
    EXPECT_TRUE(Contains(lenient.err, "WARNING: " + flow.string() + ":4:35:")) << lenient.err;
    const CliRun render = Orvane("render " + Quote(flow.string()));
    EXPECT_EQ(render.exitCode, 2);
    EXPECT_FALSE(Contains(render.out, "FRAME")) << "nothing is rendered";

    for (const auto &example : std::filesystem::directory_iterator(ORVANE_SOURCE_DIR "/examples")) {
        if (example.path().extension() != ".flow") continue;
        const CliRun ok = Orvane("check " + Quote(example.path().string()));
        EXPECT_EQ(ok.exitCode, 0) << example.path() << "\n" << ok.err;
        EXPECT_TRUE(ok.err.empty()) << ok.err;
    }
}

TEST(CliDescribe, TheToolReferenceIsWhatTheProgramSays) {
    // docs/tools is written by scripts/gen-tool-docs.sh; a page that differs from the program has drifted.
    const CliRun tools = Orvane("tools");
    size_t pages = 0;
    for (const auto &page : std::filesystem::directory_iterator(ORVANE_SOURCE_DIR "/docs/tools")) {
        const std::string id = page.path().stem().string();
        if (id == "README") continue;
        ++pages;
        const CliRun r = Orvane("describe " + id + " --markdown");
        EXPECT_EQ(r.out, ReadFile(page.path())) << id << " drifted: run scripts/gen-tool-docs.sh";
    }
    size_t built = 0;
    std::istringstream lines(tools.out);
    for (std::string line; std::getline(lines, line);)
        built += line.size() > 3 && line.compare(line.size() - 3, 3, "yes") == 0 && !Contains(line, " format ");
    EXPECT_EQ(pages, built) << "one page per built tool";
}

TEST(CliEval, ChoicesTakeNamesAndSwitchSourcesAreNamedByTheFlow) {
    TempDir dir;
    const auto flow =
        dir.File("switch.flow", "Orvane.Document { Tools = {\n"
                                " Red = Background { Inputs = { Width = 8, Height = 8, TopLeftRed = 1 } },\n"
                                " Blue = Background { Inputs = { Width = 8, Height = 8, TopLeftBlue = 1 } },\n"
                                " Sw = Switch { Inputs = { Input0 = Red.Output, Input1 = Blue.Output } },\n} }\n");
    const CliRun blue = Orvane("eval " + Quote(flow.string()) + " Sw --set Sw.Source=Blue --pixel 1,1 --json");
    EXPECT_EQ(blue.exitCode, 0) << blue.err;
    EXPECT_TRUE(Contains(blue.out, "\"values\": [0, 0, 1, 1]")) << blue.out;
    EXPECT_TRUE(Contains(blue.out, "\"depth\": \"RGBA float32\"")) << blue.out;
    const CliRun none = Orvane("eval " + Quote(flow.string()) + " Sw --set Sw.Source=Green");
    EXPECT_EQ(none.exitCode, 2);
    EXPECT_TRUE(Contains(none.err, "no choice 'Green' (choices: 0 Red, 1 Blue)")) << none.err;
    const CliRun described = Orvane("describe Switch");
    EXPECT_TRUE(Contains(described.out, "choices: \"Input 0\" (0), \"Input 1\" (1)")) << described.out;
}

} // namespace
} // namespace Orvane::clitest
