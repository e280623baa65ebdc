// The orvane command line as a separate process: help, tools and describe, checking and editing flow documents,
// eval; output, JSON, and exit codes.
#include <gtest/gtest.h>

#include <algorithm>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include "host/core/ScriptVal.h"
#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

TEST(Cli, CommandsAnswerWithTheirExitCodesAndMessages) {
    TempDir dir;
    auto flow = [&](const char *name, const std::string &tools) {
        return Quote(dir.File(name, "Orvane.Document { Tools = { " + tools + " } }\n").string());
    };
    const std::string syntax =
        Quote(dir.File("syntax.flow", "Orvane.Document {\n\tTools = {\n\t\tA = Blur { Inputs = { x = } },\n").string());
    const std::string ok = flow("ok.flow", "Blur1 = Blur {}");
    const std::string wrong = flow("wrong.flow", "Blur1 = Blur { Inputs = { Blend = {} } }");
    const std::string unknown = flow("unknown.flow", "X1 = FutureTool { Inputs = { Q = 3 } }, Blur1 = Blur {}");
    const std::string glow = "eval " + flow("planned.flow", "Glow1 = Glow {}") + " Glow1 --json";
    const std::string sw =
        flow("switch.flow", "Red = Background { Inputs = { Width = 8, Height = 8, TopLeftRed = 1 } },"
                            "Blue = Background { Inputs = { Width = 8, Height = 8, TopLeftBlue = 1 } },"
                            "Sw = Switch { Inputs = { Input0 = Red.Output, Input1 = Blue.Output } }");
    const std::string blue = "eval " + sw + " Sw --set Sw.Source=Blue --pixel 1,1 --json";
    const std::string d = dir.Path().string(), lenient = "eval --lenient " + unknown + " X1";
    const std::string lut = flow("lut.flow", "Bg = Background { Inputs = { Width = 4, Height = 4 } },"
                                             "L = FileLUT { Inputs = { Input = Bg.Output, LUTFile = \"none.cube\" } }");
    const std::string future = d + "/unknown.flow:1:34: X1: unknown class 'FutureTool'";
    const struct {
        std::string args;
        int exitCode;
        std::vector<std::string> out, err;
    } cases[] = {
        // Search finds classes by alias and marks unbuilt ones; abstract and hidden classes only with --all.
        {"tools --search dither", 0, {"ChangeDepth", "yes", "1 classes"}, {}},
        {"tools --search shuffle", 0, {"ChannelBoolean"}, {}},
        {"tools --all", 0, {"201 classes", "SwitchBase"}, {}},
        {"tools", 0, {"194 classes"}, {}},
        {"tools --bogus", 2, {}, {}},
        {"frobnicate", 2, {}, {}},
        {"", 2, {"usage: orvane COMMAND"}, {}}, // usage goes to standard output
        {"rendr x.flow", 2, {}, {"unknown command 'rendr' (did you mean 'render'?)"}},
        {"describe NoSuchClass", 2, {}, {"ERROR: unknown class 'NoSuchClass'"}},
        {"describe Glow", 0, {"path:          Tools/Effect/Glow", "built:         not yet", "EffectMask"}, {}},
        {"describe SetBgColor", 0, {"SetCanvasColor"}, {}}, // an old class ID names the class that replaced it
        {"describe Switch", 0, {"choices: \"Input 0\" (0), \"Input 1\" (1)"}, {}},
        // Colour spaces of the built-in configuration; a configuration that cannot be read names the file.
        {"colorspaces", 0, {"configuration: built-in", "Cineon Log", "aliases: cineon, log", "scene_linear"}, {}},
        {"colorspaces --config " + Quote(d + "/none.ocio"),
         3,
         {},
         {"cannot read colour configuration '" + d + "/none.ocio'"}},
        {"colorspaces --frobnicate", 2, {}, {}},
        {"eval " + lut + " L", 3, {}, {"L: cannot read LUT file '" + d + "/none.cube'"}},
        // Document errors are one line with exit code 2.
        {"eval " + syntax + " A", 2, {}, {"ERROR: " + d + "/syntax.flow:3:"}},
        {"eval " + Quote(d + "/none.flow") + " A", 2, {}, {"cannot open"}},
        {"eval " + ok + " Nope", 2, {}, {"no tool 'Nope'"}},
        {"eval " + ok + " Blur1 --set Blur1.NoSuchInput=1", 2, {}, {"has no input 'NoSuchInput'"}},
        {"eval " + ok + " Blur1 --set 'Blur1.Blend=\"high\"'", 2, {}, {"expects a number"}},
        {"eval " + wrong + " Blur1", 2, {}, {"Blur1.Blend: expects a number"}},
        // An unknown class is kept with a warning when lenient, and fails only when asked for.
        {"eval " + unknown + " Blur1", 2, {}, {"ERROR: " + future}},
        {lenient, 2, {}, {"WARNING: " + future, "ERROR: tool 'X1' is of a class this program does not know"}},
        // A tool that is not built fails with exit code 3.
        {glow, 3, {"\"ok\": false", "Glow1: the Glow tool is not available yet"}, {}},
        {glow, 3, {}, {"ERROR: Glow1: the Glow tool is not available yet"}},
        // Choices take names, and a switch's sources are named by the flow.
        {blue, 0, {"\"values\": [0, 0, 1, 1]", "\"depth\": \"RGBA float32\""}, {}},
        {"eval " + sw + " Sw --set Sw.Source=Green", 2, {}, {"no choice 'Green' (choices: 0 Red, 1 Blue)"}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE("orvane " + c.args);
        const CliRun r = Orvane(c.args);
        EXPECT_EQ(r.exitCode, c.exitCode) << r.err;
        for (const std::string &part : c.out) EXPECT_TRUE(Has(r.out, part));
        for (const std::string &part : c.err) EXPECT_TRUE(Has(r.err, part));
    }
    const CliRun offered = Orvane("tools"), loader = Orvane("describe Loader");
    EXPECT_FALSE(Contains(offered.out, "SwitchBase") || Contains(offered.out, "TeapotMask"));
    for (const char *id : {"Part", "View", "Layer", "ChannelR", "ChannelA", "ChannelZ", "ChannelYDisp"})
        EXPECT_TRUE(Has(loader.out, std::string("  Clip1.OpenEXRFormat.") + id + " "));
    // Every command has help, and the program a version.
    for (const char *command : {"render", "eval", "check", "new", "add", "set", "connect", "remove", "tools",
                                "describe", "info", "version"}) {
        SCOPED_TRACE(command);
        const CliRun help = Orvane(std::string(command) + " --help");
        EXPECT_EQ(help.exitCode, 0) << help.err;
        EXPECT_TRUE(Starts(help.out, std::string("orvane ") + command));
        EXPECT_TRUE(help.err.empty()) << help.err;
    }
    const CliRun version = Orvane("--version");
    EXPECT_EQ(version.exitCode, 0);
    EXPECT_TRUE(std::regex_match(version.out, std::regex("orvane [0-9]+\\.[0-9]+\\.[0-9]+\n"))) << version.out;
}

/// The input table of a tool in a saved flow.
ScriptVal InputsIn(const std::filesystem::path &flow, const char *tool) {
    const ScriptVal root = ScriptVal::FromText(ReadFile(flow));
    const ScriptVal *inputs = root.Find("Tools")->Find(tool)->Find("Inputs");
    return inputs ? *inputs : ScriptVal();
}

TEST(CliEdit, AFlowIsBuiltChangedAndChecked) {
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
        EXPECT_TRUE(Has(r.err, b.says)) << b.command;
        EXPECT_EQ(ReadFile(path), before) << b.command;
    }

    // Removing a tool takes its links with it; a comment written by hand survives the edits.
    dir.File("comp.flow", "-- made for the test\n" + before);
    const CliRun removed = Orvane("remove " + flow + " Small");
    EXPECT_EQ(removed.exitCode, 0) << removed.err;
    EXPECT_TRUE(Has(removed.out, "unlinked M1.Background"));
    EXPECT_EQ(InputsIn(path, "M1").Find("Background"), nullptr);
    EXPECT_TRUE(Starts(ReadFile(path), "-- made for the test\nOrvane.Document {"));
    // Checking lists every problem with its place, and the examples pass.
    const auto checked = dir.File("bad.flow", "Orvane.Document {\n\tRenderRange = { 10, 1 },\n\tTools = {\n"
                                              "\t\tB1 = Blur { Inputs = { Filter = \"Gausian\", XBlurSize = -1 } },\n"
                                              "\t\tM1 = Merge { Inputs = { FilterMethod = 42 } },\n\t},\n}\n");
    const CliRun r = Orvane("check " + Quote(checked.string()));
    EXPECT_EQ(r.exitCode, 2);
    for (const char *line :
         {":2:16: RenderRange is reversed", ":4:35: B1.Filter: no choice 'Gausian' (did you mean 'Gaussian'?)",
          ":4:58: B1.XBlurSize: -1 is below the least allowed value 0",
          ":5:42: M1.FilterMethod: 42 is not a choice (0 Nearest Neighbor"})
        EXPECT_TRUE(Has(r.err, "ERROR: " + checked.string() + line));
    EXPECT_TRUE(Has(r.err, "4 problems"));
    const CliRun lenient = Orvane("check --lenient " + Quote(checked.string()));
    EXPECT_EQ(lenient.exitCode, 0) << lenient.err;
    EXPECT_TRUE(Has(lenient.err, "WARNING: " + checked.string() + ":4:35:"));
    const CliRun render = Orvane("render " + Quote(checked.string()));
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
        built += line.size() > 3 && line.compare(line.size() - 3, 3, "yes") == 0 && !Contains(line, " format ") &&
                 !Contains(line, " data type "); // formats and data types are no tools
    EXPECT_EQ(pages, built) << "one page per built tool";
}

} // namespace
} // namespace Orvane::clitest
