// The orvane command line, run as a separate process the way scripts and
// render farms run it: output, JSON, and exit codes.
#include <gtest/gtest.h>

#include <algorithm>
#include <string>

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

} // namespace
} // namespace Orvane::clitest
