// Modifiers from the command line: eval prints a driven number or point at the time asked (worked out here from the
// document's curve, scale and operation), and describe lists Calculation's operations.
#include <gtest/gtest.h>

#include <string>

#include "tests/apps/CliRun.h"

namespace Orvane::clitest {
namespace {

// Calc1 = FirstOperand(0.5 t) * 4 with FirstOperand rising 9 a frame: 18 t. Expr1 reads it now and at frame 2.
constexpr const char *kFlow = R"flow(Orvane.Document { Tools = {
    Calc1 = Calculation { Inputs = { FirstOperand = Curve { { 0, 0 }, { 10, 90 } }, SecondOperand = 4,
                                     Operator = 2, FirstOperandTimeScale = 0.5 } },
    Expr1 = Expression { Inputs = { NumberIn1 = Calc1.Result, NumberExpression = "n1 - 1",
                                    PointExpressionX = "n1_at(2)", PointExpressionY = "time" } },
} })flow";

TEST(ModifierCli, EvalPrintsModifierValuesAndDescribeListsTheOperations) {
    TempDir dir;
    const std::string flow = Quote(dir.File("m.flow", kFlow).string());
    const struct {
        std::string args, want;
    } cases[] = {
        {"Calc1.Result --time 4", "Calc1.Result at time 4\n  value         72\n"},
        {"Calc1.Result --time 2.5 --json", "\"value\": \"45\""},
        {"Expr1.NumberResult --time 4", "value         71\n"},
        {"Expr1.PointResult --time 3", "value         { 36, 3 }\n"},
    };
    for (const auto &c : cases) {
        const CliRun run = Orvane("eval " + flow + " " + c.args);
        EXPECT_EQ(run.exitCode, 0) << c.args << "\n" << run.err;
        EXPECT_NE(run.out.find(c.want), std::string::npos) << c.args << "\n" << run.out;
    }
    const CliRun describe = Orvane("describe Calculation");
    EXPECT_NE(describe.out.find("\"Divide   (First / Second)\" (3), \"Divide   (Second / First)\" (4)"),
              std::string::npos)
        << describe.out;
    // A modifier makes a number: no blend, channel switches or effect mask, which act on images.
    EXPECT_EQ(describe.out.find("Blend"), std::string::npos) << describe.out;
    EXPECT_EQ(describe.out.find("EffectMask"), std::string::npos) << describe.out;
}

} // namespace
} // namespace Orvane::clitest
